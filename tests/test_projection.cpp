// Projection descriptions: grammar, records, parameter texts, ellipsoids,
// reprojection against published and independently computed coordinates, and
// the texts PROJ defines (EPSG codes, PROJ strings, WKT) against their
// equivalents in our own grammar.

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "../host/src/proj_definition.h"
#include "projection.h"
#include "runtime.h"
#include "support/warnings.h"

namespace {

using lumo::support::WarningCapture;

constexpr double kPi = 3.14159265358979323846;
constexpr double kFtUS = 1200.0 / 3937.0;

// Address of a temporary description, valid for the full expression.
const ProjInfo_t* Ptr(const ProjInfo_t& sInfo) {
    return &sInfo;
}

ProjInfo_t Make(const std::string& osText) {
    ProjInfo_t sInfo;
    InitProjInfo(&sInfo, 0);
    EXPECT_EQ(Geosys2ProjInfo(&sInfo, osText.c_str(), 0.0, 0.0, 1.0, 1.0), 0)
        << osText << ": " << ExplainGeosys(osText.c_str());
    return sInfo;
}

ProjInfo_t WithParms(const char* pszText, std::initializer_list<std::pair<int, double>> aParms) {
    ProjInfo_t sInfo = Make(pszText);
    for (const auto& p : aParms) sInfo.adfProjParms[p.first] = p.second;
    return sInfo;
}

// The British National Grid's transverse Mercator on its own datum.
ProjInfo_t BritishGrid() {
    return WithParms(
        "TM D005",
        {{2, 0.9996012717}, {4, -2000000.0}, {5, 49000000.0}, {6, 400000.0}, {7, -100000.0}});
}

// Meridian arc length from the equator, by Simpson integration (independent
// of any projection library).
double MeridianArc(double dfA, double dfB, double dfLatDeg) {
    const double dfE2 = (dfA * dfA - dfB * dfB) / (dfA * dfA);
    const double dfPhi = dfLatDeg * kPi / 180.0;
    const int nSteps = 20000;
    const double dfH = dfPhi / nSteps;
    double dfSum = 0.0;
    for (int i = 0; i <= nSteps; ++i) {
        const double s = std::sin(i * dfH);
        const double f = dfA * (1 - dfE2) / std::pow(1 - dfE2 * s * s, 1.5);
        dfSum += f * (i == 0 || i == nSteps ? 1 : (i % 2 ? 4 : 2));
    }
    return dfSum * dfH / 3.0;
}

// Geocentric translation between two ellipsoids, computed directly.
void HelmertShift(double dfLon, double dfLat, double dfA1, double dfB1, double dfTx, double dfTy,
                  double dfTz, double dfA2, double dfB2, double* pdfLon, double* pdfLat) {
    const double e1 = (dfA1 * dfA1 - dfB1 * dfB1) / (dfA1 * dfA1);
    const double phi = dfLat * kPi / 180.0;
    const double lam = dfLon * kPi / 180.0;
    const double n = dfA1 / std::sqrt(1 - e1 * std::sin(phi) * std::sin(phi));
    const double x = n * std::cos(phi) * std::cos(lam) + dfTx;
    const double y = n * std::cos(phi) * std::sin(lam) + dfTy;
    const double z = n * (1 - e1) * std::sin(phi) + dfTz;
    const double e2 = (dfA2 * dfA2 - dfB2 * dfB2) / (dfA2 * dfA2);
    const double p = std::hypot(x, y);
    double lat = std::atan2(z, p * (1 - e2));
    for (int i = 0; i < 20; ++i) {
        const double nn = dfA2 / std::sqrt(1 - e2 * std::sin(lat) * std::sin(lat));
        const double h = p / std::cos(lat) - nn;
        lat = std::atan2(z, p * (1 - e2 * nn / (nn + h)));
    }
    *pdfLon = std::atan2(y, x) * 180.0 / kPi;
    *pdfLat = lat * 180.0 / kPi;
}

constexpr double kWgsA = 6378137.0;
constexpr double kWgsB = 6356752.314245179;
constexpr double kMetresPerDegree = 111319.49;  // at the equator, to turn degrees into metres

}  // namespace

TEST(ProjectionGrammar, NormalisesKnownTextsAndReturnsKinds) {
    struct Case {
        const char* pszIn;
        int nKind;
        const char* pszOut;
    };
    const Case aCases[] = {
        {"LON D0", NOVA_PROJ_GEOGRAPHIC, "LON D000"},
        {"  long\t  e8 ", NOVA_PROJ_GEOGRAPHIC, "LONG E008"},
        {"long/lat", NOVA_PROJ_GEOGRAPHIC, "LONG/LAT"},
        {"meter", NOVA_PROJ_METRE, "METRE"},
        {"utm 05 c e3", NOVA_PROJ_UTM, "UTM 5 C E003"},
        {"UTM 60 X D011", NOVA_PROJ_UTM, "UTM 60 X D011"},
        {"tm d3", NOVA_PROJ_TM, "TM D003"},
        {"PS E019", NOVA_PROJ_PS, "PS E019"},
    };
    for (const Case& c : aCases) {
        char szOut[20] = "garbage";
        EXPECT_EQ(DecodeGeosys(c.pszIn, szOut), c.nKind) << c.pszIn;
        EXPECT_STREQ(szOut, c.pszOut) << c.pszIn;
        EXPECT_EQ(DecodeGeosys(c.pszIn, nullptr), c.nKind);
        // Normalising in place works.
        char szInPlace[20];
        std::strcpy(szInPlace, c.pszIn);
        EXPECT_EQ(DecodeGeosys(szInPlace, szInPlace), c.nKind);
        EXPECT_STREQ(szInPlace, c.pszOut);
    }
}

// Malformed texts, and foreign texts that cannot describe a ground system,
// are refused with a reason and leave the record as it was.
TEST(ProjectionGrammar, RejectsMalformedTextsWithoutOverflow) {
    std::vector<const char*> apszBad = {
        "",          "   ",      "UTM 0",  "UTM 61",     "UTM 31 I", "UTM 31 UU",         "FOO",
        "LONG D999", "LONG E20", "LONG D", "PIXEL D000", "LON D0x",  "LONG/LAT D000 D000"};
    // The foreign ones: a vertical system, no such code, US survey feet, an
    // extra token, neither code nor keyword, a datum shift of its own, not WKT.
    apszBad.insert(apszBad.end(),
                   {"EPSG:5773", "EPSG:9999999", "EPSG:2263", "EPSG:4326 D000",
                    "+proj=laea +lat_0=52 +lon_0=10 +ellps=GRS80",
                    "+proj=utm +zone=31 +ellps=intl +towgs84=-87,-98,-121", "PROJCS[\"broken\""});
    WarningCapture oCapture;
    for (const char* pszBad : apszBad) {
        EXPECT_FALSE(ExplainGeosys(pszBad).empty()) << pszBad;
        char szOut[20] = "untouched";
        EXPECT_EQ(DecodeGeosys(pszBad, szOut), NOVA_PROJ_UNKNOWN) << pszBad;
        EXPECT_STREQ(szOut, "") << pszBad;
        ProjInfo_t sInfo = Make("UTM 31 U D000");
        const ProjInfo_t sBefore = sInfo;
        EXPECT_LT(Geosys2ProjInfo(&sInfo, pszBad, 0.0, 0.0, 1.0, 1.0), 0) << pszBad;
        EXPECT_EQ(std::memcmp(&sInfo, &sBefore, sizeof(sInfo)), 0) << "record changed: " << pszBad;
    }
    EXPECT_EQ(DecodeGeosys(nullptr, nullptr), NOVA_PROJ_UNKNOWN);
    ProjInfo_t sInfo;
    EXPECT_LT(Geosys2ProjInfo(&sInfo, nullptr, 0, 0, 1, 1), 0);
    EXPECT_LT(Geosys2ProjInfo(nullptr, "LON D0", 0, 0, 1, 1), 0);
    EXPECT_LT(Geosys2ProjInfo(&sInfo, "LON D0", NAN, 0, 1, 1), 0);
    EXPECT_NE(ExplainGeosys("EPSG:5773").find("geographic or projected"), std::string::npos);
    EXPECT_NE(ExplainGeosys("EPSG:2263").find("metres"), std::string::npos);
    EXPECT_TRUE(ExplainGeosys("EPSG:32631").empty());

    // Unknown earth models are reported as such, other faults as GCP units.
    bool bEarth = false;
    bool bUnit = false;
    for (const auto& r : oCapture.maoReports) {
        EXPECT_EQ(r.nCode, 32);
        EXPECT_FALSE(r.bFatal);
        bEarth |= r.osText.find("Earth model") != std::string::npos &&
                  r.osText.find("LONG D999") != std::string::npos;
        bUnit |= r.osText.find("GCP Unit") != std::string::npos;
    }
    EXPECT_TRUE(bEarth);
    EXPECT_TRUE(bUnit);

    // Very long texts, valid prefix or not, are refused.
    std::string osLong = "UTM 31 U D000" + std::string(100000, ' ') + "X";
    char szOut[20];
    EXPECT_EQ(DecodeGeosys(osLong.c_str(), szOut), NOVA_PROJ_UNKNOWN);
    std::string osHuge(100000, 'A');
    EXPECT_EQ(DecodeGeosys(osHuge.c_str(), szOut), NOVA_PROJ_UNKNOWN);
    EXPECT_LT(Geosys2ProjInfo(&sInfo, osHuge.c_str(), 0, 0, 1, 1), 0);
    for (const auto& r : oCapture.maoReports) EXPECT_LT(r.osText.size(), 400u);
}

TEST(ProjectionRecord, FillsFieldsFromText) {
    ProjInfo_t sInfo;
    InitProjInfo(&sInfo, 1);
    EXPECT_STREQ(sInfo.szProj, "PIXEL");
    ASSERT_EQ(Geosys2ProjInfo(&sInfo, "utm 33 s d1", 10.0, 20.0, 30.0, -40.0), 0);
    EXPECT_STREQ(sInfo.szProj, "UTM 33 S D001");
    EXPECT_EQ(sInfo.nZone, 33);  // band S lies in the northern hemisphere
    EXPECT_EQ(sInfo.nSpheroid, 0);
    EXPECT_EQ(sInfo.dfYScale, -40.0);
    EXPECT_EQ(Make("UTM 33 M D000").nZone, -33);
    EXPECT_EQ(Make("LONG E008").nEarthModelKind, NOVA_EARTH_ELLIPSOID);
    EXPECT_EQ(Make("LONG/LAT").nSpheroid, 12);

    EXPECT_EQ(ProjStringToProjInfo("PIXEL", &sInfo), 0);
    EXPECT_EQ(sInfo.nProjKind, NOVA_PROJ_PIXEL);
    EXPECT_EQ(ProjStringToProjInfo("NOPE", &sInfo), -1);
    EXPECT_EQ(ProjStringToProjInfo("PIXEL", nullptr), -1);
    EXPECT_EQ(RequiresProjInfo(NOVA_PROJ_TM), 1);
    EXPECT_EQ(RequiresProjInfo(NOVA_PROJ_UTM), 0);
    EXPECT_EQ(IsConformal("LCC D001"), 1);
    EXPECT_EQ(IsConformal("LONG/LAT D000"), 0);
    EXPECT_EQ(IsConformal(nullptr), 0);
}

TEST(ProjectionEllipsoids, CodesBothWaysAndDatumTable) {
    // Published axes of GCTP spheroids named by code, datum, projection text
    // or EPSG code; every code's axes name the code again, within 1 mm and not beyond.
    const struct {
        const char* pszCode;
        int nIndex;
        double a, b;
    } aKnown[] = {{"E000", 0, 6378206.4, 6356583.8},
                  {"E019", 19, 6370997.0, 6370997.0},
                  {"D000", 12, 6378137.0, 6356752.314245},
                  {"UTM 31 U D001", 0, 6378206.4, 6356583.8},
                  {"EPSG:2056", 2, 6377397.155, 6356078.962818}};  // Bessel
    for (const auto& k : aKnown) {
        int nIndex = -5;
        double a = 0, b = 0;
        ASSERT_TRUE(GetEllipsoidData(k.pszCode, &nIndex, &a, &b)) << k.pszCode;
        EXPECT_EQ(nIndex, k.nIndex);
        EXPECT_NEAR(a, k.a, 1e-6);
        EXPECT_NEAR(b, k.b, 1e-6);
    }
    for (int i = 0; i < 20; ++i) {
        char szCode[8];
        std::snprintf(szCode, sizeof(szCode), "E%03d", i);
        int nIndex = -5;
        double a = 0, b = 0;
        ASSERT_TRUE(GetEllipsoidData(szCode, &nIndex, &a, &b)) << szCode;
        EXPECT_EQ(EllipsoidInfoList::GetEllipsoidCode(a + 0.0009, b), szCode);
        EXPECT_EQ(EllipsoidInfoList::GetEllipsoidCode(a + 0.002, b), "");
    }
    EXPECT_EQ(EllipsoidInfoList::GetEllipsoidCode(NAN, 6356752.314245), "");
    int nIndex = -1;
    double a = 0, b = 0;
    for (const char* pszBad : {"D999", "E20", "X1"}) {
        EXPECT_FALSE(GetEllipsoidData(pszBad, &nIndex, &a, &b)) << pszBad;
    }
    EXPECT_FALSE(GetEllipsoidData(nullptr, &nIndex, &a, &b));
    EXPECT_EQ(nova::detail::ProjInfoToProjDefinition(Make("LONG D007")), "EPSG:4284");

    // Earth-model codes of descriptions, usable behind "LONG %s", EPSG
    // systems' included; axes that match no entry have none.
    ProjInfo_t sCustom = Make("TM");
    sCustom.nEarthModelKind = NOVA_EARTH_SPHEROID_PARMS;
    sCustom.nSpheroid = 5;
    ProjInfo_t sNoEntry = sCustom;
    sNoEntry.adfProjParms[0] = 6400000.0;
    sNoEntry.adfProjParms[1] = 6390000.0;
    const std::pair<ProjInfo_t, const char*> aModels[] = {
        {Make("UTM 31 U D003"), "D003"}, {Make("METRE"), "D000"},     {sCustom, "E005"},
        {Make("EPSG:27700"), "D005"},    {Make("EPSG:2154"), "E008"}, {sNoEntry, ""}};
    char szModel[16];
    for (const auto& [sInfo, pszModel] : aModels) {
        EXPECT_EQ(GetEarthModel(&sInfo, szModel), *pszModel ? 0 : -1) << pszModel;
        EXPECT_STREQ(szModel, pszModel);
    }
    EXPECT_EQ(GetEarthModel(nullptr, szModel), -1);
}

TEST(ProjectionParms, TextRoundTripsExactlyWithinBound) {
    ProjInfo_t sInfo = BritishGrid();
    char* pszText = ProjInfo2Parms(&sInfo);
    ASSERT_NE(pszText, nullptr);
    EXPECT_STREQ(pszText, "GCTP 9 1 2:0.9996012717 4:-2000000 5:49000000 6:400000 7:-100000");
    std::free(pszText);

    // Arbitrary bit patterns (huge, tiny, subnormal, negative zero) survive
    // exactly and the text stays within 255 characters.
    std::mt19937_64 oRandom(42);
    for (int nTrial = 0; nTrial < 2000; ++nTrial) {
        ProjInfo_t sSource = Make("LCC");
        for (double& dfValue : sSource.adfProjParms) {
            do {
                const std::uint64_t nBits = oRandom();
                std::memcpy(&dfValue, &nBits, 8);
            } while (!std::isfinite(dfValue));
            if (oRandom() % 4 == 0) dfValue = 0.0;
            if (oRandom() % 16 == 0) dfValue = -0.0;
            if (oRandom() % 4 == 0) dfValue = static_cast<double>(oRandom() % 100000000) / 7.0;
        }
        sSource.nEarthModelKind = NOVA_EARTH_SPHEROID_PARMS;
        sSource.nSpheroid = static_cast<int>(oRandom() % 20);
        char* pszParms = ProjInfo2Parms(&sSource);
        ASSERT_LE(std::strlen(pszParms), 255u);
        ProjInfo_t sTarget = Make("LCC");
        ASSERT_EQ(ProjParms2Info(pszParms, &sTarget), 0) << pszParms;
        EXPECT_EQ(
            std::memcmp(sTarget.adfProjParms, sSource.adfProjParms, sizeof(sSource.adfProjParms)),
            0)
            << pszParms;
        EXPECT_EQ(sTarget.nSpheroid, sSource.nSpheroid);
        EXPECT_EQ(sTarget.nEarthModelKind, NOVA_EARTH_SPHEROID_PARMS);
        std::free(pszParms);
    }

    // Malformed texts fail and leave the record as it was.
    const ProjInfo_t sBefore = sInfo;
    const std::string osTooLong = "GCTP 12 0 0:1" + std::string(300, ' ');
    for (const char* pszBad :
         {"", "GCTP", "GCTP 12", "GCTP 20 0", "GCTP 12 4", "GCTP 12 0 15:1", "GCTP 12 0 1:2 1:3",
          "GCTP 12 0 1:nan", "GCTP 12 0 1:inf", "GCTP 12 0 1:", "GCTP 12 0 1:2x", "XGCTP 12 0",
          "GCTP 12 0 #AAAA", "GCTP 12 0 1:1e999", osTooLong.c_str()}) {
        EXPECT_EQ(ProjParms2Info(pszBad, &sInfo), -1) << pszBad;
        EXPECT_EQ(std::memcmp(&sInfo, &sBefore, sizeof(sInfo)), 0) << pszBad;
    }
    EXPECT_EQ(ProjParms2Info(nullptr, &sInfo), -1);
    EXPECT_EQ(ProjParms2Info("GCTP 12 0", nullptr), -1);
    // A null description still gives a valid text.
    char* pszEmpty = ProjInfo2Parms(nullptr);
    EXPECT_STREQ(pszEmpty, "GCTP -1 0");
    std::free(pszEmpty);
}

TEST(ProjectionAngles, PackedDmsAndUtmZones) {
    double dfDeg = 0.0;
    ASSERT_EQ(PackedDMSToDegrees(45030015.5, &dfDeg), 0);
    EXPECT_NEAR(dfDeg, 45.0 + 30.0 / 60.0 + 15.5 / 3600.0, 1e-12);
    ASSERT_EQ(PackedDMSToDegrees(-99000000.0, &dfDeg), 0);
    EXPECT_EQ(dfDeg, -99.0);
    EXPECT_EQ(PackedDMSToDegrees(45060000.0, &dfDeg), -1);  // 60 minutes
    EXPECT_EQ(PackedDMSToDegrees(45000060.0, &dfDeg), -1);  // 60 seconds
    EXPECT_EQ(PackedDMSToDegrees(NAN, &dfDeg), -1);
    EXPECT_EQ(DegreesToPackedDMS(-3.5), -3030000.0);
    EXPECT_EQ(DegreesToPackedDMS(59.99999999999), 60000000.0);  // carries into degrees
    for (double d : {0.0, 12.345678, -77.777, 179.999999, 89.5}) {
        ASSERT_EQ(PackedDMSToDegrees(DegreesToPackedDMS(d), &dfDeg), 0);
        EXPECT_NEAR(dfDeg, d, 1e-10);
    }

    struct ZoneCase {
        double dfLon, dfLat;
        int nZone;
        char cRow;
    };
    for (const ZoneCase& c : {ZoneCase{-75, 40, 18, 'T'},
                              {180, 0, 60, 'N'},
                              {540, 10, 60, 'P'},
                              {5, 60, 32, 'V'},
                              {10, 78, 33, 'X'},
                              {-0.0001, -80, 30, 'C'}}) {
        int nZone = 0;
        char cRow = '?';
        EXPECT_EQ(UTMZone(c.dfLon, c.dfLat, &nZone, &cRow), 0);
        EXPECT_EQ(nZone, c.nZone) << c.dfLon << " " << c.dfLat;
        EXPECT_EQ(cRow, c.cRow) << c.dfLon << " " << c.dfLat;
    }
    int nZone = 7;
    EXPECT_EQ(UTMZone(NAN, 10, &nZone, nullptr), -1);
    EXPECT_EQ(nZone, 0);
    EXPECT_EQ(UTMZone(10, 90.5, &nZone, nullptr), -1);
    EXPECT_EQ(UTMZone(INFINITY, 0, nullptr, nullptr), -1);
}

namespace {

// "UTM 18" on GCTP's own earth model: a spheroid code, or explicit axes.
ProjInfo_t Utm18OnSpheroid(int nSpheroid, double dfA, double dfE2) {
    ProjInfo_t sInfo = WithParms("UTM 18", {{0, dfA}, {1, dfE2}});
    sInfo.nEarthModelKind = NOVA_EARTH_SPHEROID_PARMS;
    sInfo.nSpheroid = nSpheroid;
    return sInfo;
}

// Ground distance in metres between two longitude/latitude positions.
double MetresApart(double dfLon1, double dfLat1, double dfLon2, double dfLat2) {
    return std::hypot((dfLon2 - dfLon1) * kMetresPerDegree * std::cos(dfLat1 * kPi / 180),
                      (dfLat2 - dfLat1) * kMetresPerDegree);
}

// The projected position of one point, and round trips over a grid of
// 3 x 3 points 2 degrees apart around it.
void ExpectForward(const ProjInfo_t& sGeo, double dfLon, double dfLat, const ProjInfo_t& sProj,
                   double dfE, double dfN, double dfTol) {
    double x = 0, y = 0;
    ASSERT_EQ(GCTPTransform(&sGeo, dfLon, dfLat, &sProj, &x, &y), 0) << sProj.szProj;
    EXPECT_NEAR(x, dfE, dfTol) << sProj.szProj;
    EXPECT_NEAR(y, dfN, dfTol) << sProj.szProj;
    for (double dfLat1 = dfLat - 2.0; dfLat1 <= dfLat + 2.0; dfLat1 += 2.0) {
        for (double dfLon1 = dfLon - 2.0; dfLon1 <= dfLon + 2.0; dfLon1 += 2.0) {
            double dfLon2 = 0, dfLat2 = 0;
            ASSERT_EQ(GCTPTransform(&sGeo, dfLon1, dfLat1, &sProj, &x, &y), 0) << sProj.szProj;
            ASSERT_EQ(GCTPTransform(&sProj, x, y, &sGeo, &dfLon2, &dfLat2), 0) << sProj.szProj;
            EXPECT_LT(MetresApart(dfLon1, dfLat1, dfLon2, dfLat2), 1e-3) << sProj.szProj;
        }
    }
}

}  // namespace

TEST(ProjectionTransform, PublishedExamplesAndIndependentValues) {
    // EPSG worked examples (published to 1 cm, or 0.01 US survey foot).
    ExpectForward(Make("LONG D005"), 0.5, 50.5, BritishGrid(), 577274.98, 69740.49, 0.006);
    ExpectForward(Make("LONG D001"), -96.0, 28.5,
                  WithParms("LCC D001", {{2, 28023000.0},
                                         {3, 30017000.0},
                                         {4, -99000000.0},
                                         {5, 27050000.0},
                                         {6, 2000000.0 * kFtUS}}),
                  2963503.91 * kFtUS, 254759.80 * kFtUS, 0.006 * kFtUS + 0.001);
    ExpectForward(Make("LONG D007"), 53.0, 53.0,
                  WithParms("MER D007", {{4, 51000000.0}, {5, 42000000.0}}), 165704.29, 5171848.07,
                  0.006);
    ExpectForward(Make("LONG/LAT D000"), 120.0, -75.0,
                  WithParms("PS D000", {{4, 70000000.0}, {5, -71000000.0}, {6, 6e6}, {7, 6e6}}),
                  7255380.79, 7053389.56, 0.006);

    // UTM on the central meridian: easting 500 km, northing 0.9996 times the
    // meridian arc (integrated here), false northing 10000 km in the south;
    // on datums, ellipsoid codes and GCTP's own earth model.
    const struct {
        ProjInfo_t sGeo, sUtm;
        double dfLon, dfLat, dfA, dfB;
    } aUtm[] = {
        {Make("LONG/LAT D000"), Make("UTM 31 U D000"), 3.0, 50.0, kWgsA, kWgsB},
        {Make("LONG/LAT D000"), Make("UTM 31 F D000"), 3.0, -50.0, kWgsA, kWgsB},
        {Make("LONG D001"), Make("UTM 18 T D001"), -75.0, 40.0, 6378206.4, 6356583.8},
        {Make("LON E015"), Make("UTM 35 E015"), 27.0, 60.0, 6378245.0, 6356863.0188},
        {Make("LONG E000"), Utm18OnSpheroid(0, 0.0, 0.0), -75.0, 40.0, 6378206.4, 6356583.8},
        {Make("LONG E012"), Utm18OnSpheroid(0, kWgsA, 0.0066943799901413165), -75.0, 40.0, kWgsA,
         kWgsB},
    };
    for (const auto& u : aUtm) {
        const double dfArc = 0.9996 * MeridianArc(u.dfA, u.dfB, std::fabs(u.dfLat));
        ExpectForward(u.sGeo, u.dfLon, u.dfLat, u.sUtm, 500000.0, u.dfLat < 0 ? 1e7 - dfArc : dfArc,
                      1e-3);
    }
    // An unusable earth model fails even against itself.
    const ProjInfo_t sBad = Utm18OnSpheroid(0, kWgsA, -1.0);
    double x = 0, y = 0;
    EXPECT_NE(GCTPTransform(&sBad, 500000, 0, &sBad, &x, &y), 0);
    EXPECT_NE(GCTPTransform(Ptr(Make("LONG E012")), -75, 40, &sBad, &x, &y), 0);

    // Projected to projected across zones, and the text interface.
    double x2 = 0, y2 = 0, lon = 0, lat = 0;
    char szFrom[] = "UTM 31 U D000";
    char szTo[] = "UTM 32 U D000";
    char szGeo[] = "LONG/LAT D000";
    ASSERT_EQ(GCTPSimpleTransform(szFrom, 700000, 5500000, szTo, &x, &y), 0);
    ASSERT_EQ(GCTPSimpleTransform(szFrom, 700000, 5500000, szGeo, &lon, &lat), 0);
    ASSERT_EQ(GCTPSimpleTransform(szGeo, lon, lat, szTo, &x2, &y2), 0);
    EXPECT_NEAR(x, x2, 1e-3);
    EXPECT_NEAR(y, y2, 1e-3);
}

TEST(ProjectionTransform, DatumShiftsMatchDirectHelmert) {
    // Offline, PROJ uses EPSG's geocentric translations chosen by area: NAD27
    // to WGS 84 (4) in Pennsylvania, (6) west of the Mississippi, and ED50 to
    // WGS 84 (2) in Bavaria. PROJ picks by bounding box, so points near
    // another country's box may get that country's translation. A projected
    // description on a datum shifts the same way.
    struct ShiftCase {
        const char* pszFrom;
        double dfInX, dfInY;  // in pszFrom
        double dfLon, dfLat, dfA, dfB, dfTx, dfTy, dfTz;
    };
    const double dfNorthing40 = 0.9996 * MeridianArc(6378206.4, 6356583.8, 40.0);
    const ShiftCase aCases[] = {
        {"LONG D001", -75.0, 40.0, -75.0, 40.0, 6378206.4, 6356583.8, -8, 160, 176},
        {"LONG D001", -100.0, 35.0, -100.0, 35.0, 6378206.4, 6356583.8, -8, 159, 175},
        {"LONG D003", 11.0, 48.0, 11.0, 48.0, 6378388.0, 6356911.946127947, -87, -96, -120},
        {"UTM 18 T D001", 500000.0, dfNorthing40, -75.0, 40.0, 6378206.4, 6356583.8, -8, 160, 176},
    };
    const ProjInfo_t sWgs = Make("LONG/LAT D000");
    for (const ShiftCase& c : aCases) {
        SCOPED_TRACE(c.pszFrom);
        const ProjInfo_t sFrom = Make(c.pszFrom);
        double lon = 0, lat = 0, dfLonRef = 0, dfLatRef = 0, dfX = 0, dfY = 0;
        ASSERT_EQ(GCTPTransform(&sFrom, c.dfInX, c.dfInY, &sWgs, &lon, &lat), 0);
        HelmertShift(c.dfLon, c.dfLat, c.dfA, c.dfB, c.dfTx, c.dfTy, c.dfTz, kWgsA, kWgsB,
                     &dfLonRef, &dfLatRef);
        EXPECT_LT(MetresApart(lon, lat, dfLonRef, dfLatRef), 1e-3);
        EXPECT_GT(MetresApart(lon, lat, c.dfLon, c.dfLat), 1.0);  // shifted
        ASSERT_EQ(GCTPTransform(&sWgs, lon, lat, &sFrom, &dfX, &dfY), 0);
        EXPECT_NEAR(dfX, c.dfInX, 1e-3 * (sFrom.nProjKind == NOVA_PROJ_GEOGRAPHIC ? 1e-5 : 1.0));
        EXPECT_NEAR(dfY, c.dfInY, 1e-3 * (sFrom.nProjKind == NOVA_PROJ_GEOGRAPHIC ? 1e-5 : 1.0));
    }
}

TEST(ProjectionTransform, FailuresAreReportedNotCrashed) {
    const ProjInfo_t sGeo = Make("LONG/LAT D000");
    const ProjInfo_t sUtm = Make("UTM 31 U D000");
    double x = 123.0, y = 456.0;
    EXPECT_NE(GCTPTransform(nullptr, 1, 1, &sUtm, &x, &y), 0);
    EXPECT_NE(GCTPTransform(&sGeo, 1, 1, nullptr, &x, &y), 0);
    EXPECT_NE(GCTPTransform(&sGeo, 1, 1, &sUtm, nullptr, &y), 0);
    EXPECT_NE(GCTPTransform(&sGeo, NAN, 50, &sUtm, &x, &y), 0);
    EXPECT_NE(GCTPTransform(&sGeo, 3, INFINITY, &sUtm, &x, &y), 0);
    EXPECT_NE(GCTPTransform(&sGeo, 3, 95, &sUtm, &x, &y), 0);
    EXPECT_NE(GCTPTransform(&sGeo, 3, -90.5, &sUtm, &x, &y), 0);
    EXPECT_EQ(x, 123.0);  // outputs untouched on failure
    EXPECT_EQ(y, 456.0);

    // Planes relate only to themselves.
    ProjInfo_t sPixel;
    InitProjInfo(&sPixel, 1);
    const ProjInfo_t sMetre = Make("METRE");
    EXPECT_NE(GCTPTransform(&sPixel, 1, 1, &sUtm, &x, &y), 0);
    EXPECT_NE(GCTPTransform(&sGeo, 1, 1, &sMetre, &x, &y), 0);
    EXPECT_EQ(GCTPTransform(&sPixel, 1, 2, &sPixel, &x, &y), 0);
    EXPECT_EQ(x, 1.0);
    EXPECT_EQ(GCTPTransform(&sMetre, 5, 6, &sMetre, &x, &y), 0);
    EXPECT_EQ(y, 6.0);

    // Projections without usable parameters: scale factor 0, an origin beyond
    // the pole, a polar projection true at the equator, standard parallels
    // symmetric about the equator, 70 minutes in a packed angle.
    x = y = 7.0;
    for (const ProjInfo_t& sBad :
         {Make("TM D000"), WithParms("TM", {{2, 1.0}, {5, 91000000.0}}),
          WithParms("PS", {{5, 0.0}}), WithParms("LCC", {{2, 30e6}, {3, -30e6}}),
          WithParms("TM", {{2, 1.0}, {4, 3070000.0}})}) {
        EXPECT_NE(GCTPTransform(&sGeo, 3, 50, &sBad, &x, &y), 0) << sBad.szProj;
    }
    // Texts written over the record.
    ProjInfo_t sGarbage = sUtm;
    std::memset(sGarbage.szProj, 'A', sizeof(sGarbage.szProj));  // not terminated
    EXPECT_NE(GCTPTransform(&sGarbage, 500000, 5e6, &sGeo, &x, &y), 0);
    std::strcpy(sGarbage.szProj, "UTM 99");
    EXPECT_NE(GCTPTransform(&sGarbage, 500000, 5e6, &sGeo, &x, &y), 0);
    EXPECT_EQ(x, 7.0);
    EXPECT_EQ(nova::detail::ProjInfoToProjDefinition(sGarbage), "");
    EXPECT_EQ(nova::detail::ProjInfoToProjDefinition(sPixel), "");

    char szBad[] = "NOT A SYSTEM";
    char szGeo[] = "LONG/LAT D000";
    EXPECT_NE(GCTPSimpleTransform(szBad, 1, 1, szGeo, &x, &y), 0);
    EXPECT_NE(GCTPSimpleTransform(szGeo, 1, 1, nullptr, &x, &y), 0);
}

TEST(ProjectionTransform, CacheAndThreadsGiveSameResults) {
    // More pairs than the cache holds, cycled, on several threads at once.
    std::vector<ProjInfo_t> aoZones;
    for (int nZone = 28; nZone <= 40; ++nZone) {
        aoZones.push_back(Make(("UTM " + std::to_string(nZone) + " D000").c_str()));
    }
    const ProjInfo_t sGeo = Make("LONG/LAT D000");
    auto Compute = [&](std::vector<double>* padfOut) {
        for (int nPass = 0; nPass < 3; ++nPass) {
            padfOut->clear();
            for (const ProjInfo_t& sZone : aoZones) {
                double x = 0, y = 0;
                if (GCTPTransform(&sGeo, 10.0, 45.0, &sZone, &x, &y) != 0) x = y = -1;
                padfOut->push_back(x);
                padfOut->push_back(y);
            }
        }
    };
    std::vector<double> adfReference;
    Compute(&adfReference);
    std::vector<std::vector<double>> aadfResults(4);
    std::vector<std::thread> aoThreads;
    aoThreads.reserve(aadfResults.size());
    for (auto& adf : aadfResults) aoThreads.emplace_back(Compute, &adf);
    for (auto& t : aoThreads) t.join();
    for (const auto& adf : aadfResults) EXPECT_EQ(adf, adfReference);
    EXPECT_NE(adfReference[0], -1.0);
}

namespace {

// Longitude/latitude (WGS 84) to the description.
void Project(const ProjInfo_t& sTo, double dfLon, double dfLat, double* pdfX, double* pdfY) {
    const ProjInfo_t sWgs84 = Make("LONG/LAT D000");
    ASSERT_EQ(GCTPTransform(&sWgs84, dfLon, dfLat, &sTo, pdfX, pdfY), 0) << sTo.szProj;
}

const char* const kEsriUtm31 =
    "PROJCS[\"WGS_1984_UTM_Zone_31N\",GEOGCS[\"GCS_WGS_1984\",DATUM[\"D_WGS_1984\","
    "SPHEROID[\"WGS_1984\",6378137.0,298.257223563]],PRIMEM[\"Greenwich\",0.0],"
    "UNIT[\"Degree\",0.0174532925199433]],PROJECTION[\"Transverse_Mercator\"],"
    "PARAMETER[\"False_Easting\",500000.0],PARAMETER[\"False_Northing\",0.0],"
    "PARAMETER[\"Central_Meridian\",3.0],PARAMETER[\"Scale_Factor\",0.9996],"
    "PARAMETER[\"Latitude_Of_Origin\",0.0],UNIT[\"Meter\",1.0]]";

}  // namespace

// Each foreign form normalises to a short text and describes the same system
// as the native text beside it: the same coordinates for points over the area.
TEST(ProjectionForeign, FormsMatchTheirNativeEquivalents) {
    // Central meridian 9 degrees, packed DMS.
    const ProjInfo_t sTm9 = WithParms("TM E008", {{2, 0.9996}, {4, 9000000.0}, {6, 500000.0}});
    struct Case {
        std::string osForeign;
        const char* pszNormal;
        int nKind;
        ProjInfo_t sNative;
        double dfLon, dfLat;
    };
    const Case aCases[] = {
        {"epsg:32631", "EPSG:32631", NOVA_PROJ_UTM, Make("UTM 31 D000"), 2.3, 48.8},
        {"EPSG:32721", "EPSG:32721", NOVA_PROJ_UTM, Make("UTM 21 H D000"), -56.2, -34.5},
        {"EPSG:4326", "EPSG:4326", NOVA_PROJ_GEOGRAPHIC, Make("LONG/LAT D000"), 151.2, -33.9},
        {"EPSG:27700", "EPSG:27700", NOVA_PROJ_TM, BritishGrid(), -1.5, 52.5},
        {"+proj=utm +zone=31 +datum=WGS84 +units=m", "EPSG:32631", NOVA_PROJ_UTM,
         Make("UTM 31 D000"), 4.1, 51.0},
        {kEsriUtm31, "EPSG:32631", NOVA_PROJ_UTM, Make("UTM 31 D000"), 1.0, 43.0},
        {"+proj=tmerc +lon_0=9 +k=0.9996 +x_0=500000 +ellps=GRS80", "TM E008", NOVA_PROJ_TM, sTm9,
         10.0, 47.0},
        {"+proj=longlat +ellps=intl", "LONG/LAT E004", NOVA_PROJ_GEOGRAPHIC, Make("LONG E004"),
         20.0, 40.0},
    };
    for (const Case& c : aCases) {
        char szOut[20];
        EXPECT_EQ(DecodeGeosys(c.osForeign.c_str(), szOut), c.nKind) << c.osForeign;
        EXPECT_STREQ(szOut, c.pszNormal) << c.osForeign;
        const ProjInfo_t sForeign = Make(c.osForeign);
        EXPECT_STREQ(sForeign.szProj, c.pszNormal);
        // The normalised text alone (with the parameters the record got)
        // gives the same system again.
        ProjInfo_t sAgain = Make(sForeign.szProj);
        std::memcpy(sAgain.adfProjParms, sForeign.adfProjParms, sizeof(sAgain.adfProjParms));
        for (double dfStep : {-0.4, 0.0, 0.7}) {
            double x1 = 0, y1 = 0, x2 = 0, y2 = 0, x3 = 0, y3 = 0;
            Project(sForeign, c.dfLon + dfStep, c.dfLat - dfStep, &x1, &y1);
            Project(c.sNative, c.dfLon + dfStep, c.dfLat - dfStep, &x2, &y2);
            Project(sAgain, c.dfLon + dfStep, c.dfLat - dfStep, &x3, &y3);
            const double dfTolerance = c.nKind == NOVA_PROJ_GEOGRAPHIC ? 1e-11 : 1e-6;
            EXPECT_NEAR(x1, x2, dfTolerance) << c.osForeign;
            EXPECT_NEAR(y1, y2, dfTolerance) << c.osForeign;
            EXPECT_EQ(x1, x3);
            EXPECT_EQ(y1, y3);
        }
    }
}

// Projections without a keyword of ours work by their EPSG code; their
// origins map to the published false easting and northing.
TEST(ProjectionForeign, OtherProjectionsByCodeHitPublishedOrigins) {
    struct Case {
        const char* pszCode;
        double dfLon, dfLat, dfX, dfY;
        int nKind, nConformal;
    };
    const Case aCases[] = {
        {"EPSG:3035", 10.0, 52.0, 4321000.0, 3210000.0, NOVA_PROJ_OTHER, 0},  // LAEA Europe
        {"EPSG:2154", 3.0, 46.5, 700000.0, 6600000.0, NOVA_PROJ_LCC, 1},      // Lambert-93
        {"EPSG:3413", -45.0, 90.0, 0.0, 0.0, NOVA_PROJ_PS, 1},                // NSIDC north
    };
    for (const Case& c : aCases) {
        EXPECT_EQ(DecodeGeosys(c.pszCode, nullptr), c.nKind) << c.pszCode;
        EXPECT_EQ(IsConformal(c.pszCode), c.nConformal) << c.pszCode;
        double x = 0, y = 0;
        Project(Make(c.pszCode), c.dfLon, c.dfLat, &x, &y);
        EXPECT_NEAR(x, c.dfX, 1e-6) << c.pszCode;
        EXPECT_NEAR(y, c.dfY, 1e-6) << c.pszCode;
    }
    EXPECT_EQ(IsConformal("EPSG:2056"), 1);  // Swiss oblique Mercator
}

// "UTM 21 S" is band S in the north: points of Montevideo written so land
// near 55.5 N, and the warning names the southern band and EPSG code.
TEST(ProjectionForeign, UtmBandCheckFindsTheHemisphereMeantByTheLetter) {
    double adfX[2], adfY[2];
    Project(Make("UTM 21 H D000"), -56.2, -34.9, &adfX[0], &adfY[0]);
    Project(Make("UTM 21 H D000"), -56.0, -34.7, &adfX[1], &adfY[1]);
    const std::string osAdvice = CheckUTMBand(Ptr(Make("UTM 21 S D000")), adfX, adfY, 2);
    EXPECT_NE(osAdvice.find("near latitude 55.5 N"), std::string::npos) << osAdvice;
    EXPECT_NE(osAdvice.find("\"UTM 21 H D000\" or \"EPSG:32721\""), std::string::npos) << osAdvice;
    // The right band, a neighbouring one, no band and other systems are quiet.
    for (const char* pszQuiet : {"UTM 21 H D000", "UTM 21 J D000", "UTM 21 D000", "EPSG:32721"}) {
        EXPECT_EQ(CheckUTMBand(Ptr(Make(pszQuiet)), adfX, adfY, 2), "") << pszQuiet;
    }
    const double adfNan[] = {NAN};
    EXPECT_EQ(CheckUTMBand(Ptr(Make("UTM 21 S D000")), adfNan, adfNan, 1), "");
}
