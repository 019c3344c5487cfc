// Georeferencing texts that PROJ defines: EPSG codes, PROJ strings and WKT,
// against the equivalent texts of our own grammar and published values.

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <string>

#include "nova/projection.h"
#include "nova/runtime.h"

namespace {

ProjInfo_t Make(const std::string& osText) {
    ProjInfo_t sInfo;
    InitProjInfo(&sInfo, 0);
    EXPECT_EQ(Geosys2ProjInfo(&sInfo, osText.c_str(), 0.0, 0.0, 1.0, 1.0), 0)
        << osText << ": " << ExplainGeosys(osText.c_str());
    return sInfo;
}

const ProjInfo_t* Ptr(const ProjInfo_t& sInfo) {
    return &sInfo;
}

// Longitude/latitude (WGS 84) to the description and back.
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
    ProjInfo_t sTm9 = Make("TM E008");
    sTm9.adfProjParms[2] = 0.9996;
    sTm9.adfProjParms[4] = 9000000.0;  // 9 degrees, packed DMS
    sTm9.adfProjParms[6] = 500000.0;
    ProjInfo_t sBng = Make("TM D005");
    const double adfBng[] = {0, 0, 0.9996012717, 0, -2000000, 49000000, 400000, -100000};
    std::memcpy(sBng.adfProjParms, adfBng, sizeof(adfBng));
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
        {"EPSG:27700", "EPSG:27700", NOVA_PROJ_TM, sBng, -1.5, 52.5},
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
    // Earth models and ellipsoids of EPSG systems name our tables' entries.
    char szModel[16];
    EXPECT_EQ(GetEarthModel(Ptr(Make("EPSG:27700")), szModel), 0);
    EXPECT_STREQ(szModel, "D005");
    EXPECT_EQ(GetEarthModel(Ptr(Make("EPSG:2154")), szModel), 0);
    EXPECT_STREQ(szModel, "E008");
    int nSpheroid = -1;
    double a = 0, b = 0;
    EXPECT_TRUE(GetEllipsoidData("EPSG:2056", &nSpheroid, &a, &b));
    EXPECT_EQ(nSpheroid, 2);  // Bessel
    EXPECT_NEAR(a, 6377397.155, 1e-3);
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

// What cannot describe a ground system is refused with a reason, and the
// record is left as it was.
TEST(ProjectionForeign, RefusalsExplainThemselves) {
    nova::ErrorSink oPrevious = nova::SetErrorSink([](const nova::ErrorReport&) {});
    const std::string aosBad[] = {
        "EPSG:5773",                                             // vertical
        "EPSG:9999999",                                          // no such code
        "EPSG:2263",                                             // US survey feet
        "EPSG:4326 D000",                                        // extra token
        "+proj=laea +lat_0=52 +lon_0=10 +ellps=GRS80",           // no code, no keyword
        "+proj=utm +zone=31 +ellps=intl +towgs84=-87,-98,-121",  // own datum shift
        "PROJCS[\"broken\"",                                     // not WKT
    };
    for (const std::string& osBad : aosBad) {
        ProjInfo_t sInfo = Make("UTM 31 U D000");
        const ProjInfo_t sBefore = sInfo;
        EXPECT_LT(Geosys2ProjInfo(&sInfo, osBad.c_str(), 0.0, 0.0, 1.0, 1.0), 0) << osBad;
        EXPECT_EQ(std::memcmp(&sInfo, &sBefore, sizeof(sInfo)), 0) << osBad;
        EXPECT_EQ(DecodeGeosys(osBad.c_str(), nullptr), NOVA_PROJ_UNKNOWN) << osBad;
        EXPECT_FALSE(ExplainGeosys(osBad.c_str()).empty()) << osBad;
    }
    EXPECT_NE(ExplainGeosys("EPSG:5773").find("geographic or projected"), std::string::npos);
    EXPECT_NE(ExplainGeosys("EPSG:2263").find("metres"), std::string::npos);
    EXPECT_TRUE(ExplainGeosys("EPSG:32631").empty());
    nova::SetErrorSink(oPrevious);
}

// "UTM 21 S" is band S in the north: points of Montevideo written so land
// near 55.5 N, and the warning names the southern band and EPSG code.
TEST(ProjectionForeign, UtmBandCheckFindsTheHemisphereMeantByTheLetter) {
    double adfX[2], adfY[2];
    Project(Make("UTM 21 H D000"), -56.2, -34.9, &adfX[0], &adfY[0]);
    Project(Make("UTM 21 H D000"), -56.0, -34.7, &adfX[1], &adfY[1]);
    const std::string osAdvice = CheckUTMBand(Ptr(Make("UTM 21 S D000")), adfX, adfY, 2);
    EXPECT_NE(osAdvice.find("near latitude 55.5 N"), std::string::npos) << osAdvice;
    EXPECT_NE(osAdvice.find("band S (32.0 N to 40.0 N)"), std::string::npos) << osAdvice;
    EXPECT_NE(osAdvice.find("(near latitude 34.8 S)"), std::string::npos) << osAdvice;
    EXPECT_NE(osAdvice.find("\"UTM 21 H D000\" or \"EPSG:32721\""), std::string::npos) << osAdvice;
    // The right band, a neighbouring one, no band and other systems are quiet.
    for (const char* pszQuiet : {"UTM 21 H D000", "UTM 21 J D000", "UTM 21 D000", "EPSG:32721"}) {
        EXPECT_EQ(CheckUTMBand(Ptr(Make(pszQuiet)), adfX, adfY, 2), "") << pszQuiet;
    }
    const double adfNan[] = {NAN};
    EXPECT_EQ(CheckUTMBand(Ptr(Make("UTM 21 S D000")), adfNan, adfNan, 1), "");
}
