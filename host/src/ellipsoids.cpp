// Spheroid and datum tables, and the earth-model lookups built on them.

#include <cmath>
#include <cstdio>
#include <cstring>
#include <string>

#include "proj_definition.h"
#include "projection.h"

namespace nova {
namespace detail {
namespace {

// The GCTP spheroid table, codes 0..19 (semi-major, semi-minor in metres).
constexpr SpheroidEntry kSpheroids[kSpheroidCount] = {
    {"Clarke 1866", 6378206.4, 6356583.8},
    {"Clarke 1880", 6378249.145, 6356514.86955},
    {"Bessel", 6377397.155, 6356078.96284},
    {"International 1967", 6378157.5, 6356772.2},
    {"International 1909", 6378388.0, 6356911.94613},
    {"WGS 72", 6378135.0, 6356750.519915},
    {"Everest", 6377276.3452, 6356075.4133},
    {"WGS 66", 6378145.0, 6356759.769356},
    {"GRS 1980", 6378137.0, 6356752.31414},
    {"Airy", 6377563.396, 6356256.91},
    {"Modified Everest", 6377304.063, 6356103.039},
    {"Modified Airy", 6377340.189, 6356034.448},
    {"WGS 84", 6378137.0, 6356752.314245},
    {"Southeast Asia", 6378155.0, 6356773.3205},
    {"Australian National", 6378160.0, 6356774.719},
    {"Krassovsky", 6378245.0, 6356863.0188},
    {"Hough", 6378270.0, 6356794.343479},
    {"Mercury 1960", 6378166.0, 6356784.283666},
    {"Modified Mercury 1968", 6378150.0, 6356768.337303},
    {"Sphere of radius 6370997 m", 6370997.0, 6370997.0},
};

// Our datum table (Dnnn). Datum shifts are PROJ's, found through the EPSG
// geographic CRS of each datum; the spheroid code gives the axes reported
// for the datum (the EPSG ellipsoid agrees with it to 1 mm).
constexpr DatumEntry kDatums[] = {
    {"WGS 84", 12, 4326},                          // D000
    {"NAD27", 0, 4267},                            // D001
    {"NAD83", 8, 4269},                            // D002
    {"ED50", 4, 4230},                             // D003
    {"WGS 72", 5, 4322},                           // D004
    {"OSGB 1936", 9, 4277},                        // D005
    {"Tokyo", 2, 4301},                            // D006
    {"Pulkovo 1942", 15, 4284},                    // D007
    {"GDA94", 8, 4283},                            // D008
    {"ETRS89", 8, 4258},                           // D009
    {"South American Datum 1969", 14, 4618},       // D010
    {"Australian Geodetic Datum 1966", 14, 4202},  // D011
};
constexpr int kDatumCount = static_cast<int>(sizeof(kDatums) / sizeof(kDatums[0]));
constexpr int kWgs84Datum = 0;

// Axes from the GCTP rule for adfProjParms[0..1]: a = p0; p1 > 1 is the
// semi-minor axis, 0 < p1 <= 1 the squared eccentricity, 0 a sphere.
bool AxesFromParms(double dfA, double dfS, double* pdfA, double* pdfB) {
    if (!std::isfinite(dfA) || !std::isfinite(dfS) || dfA <= 0.0 || dfS < 0.0) return false;
    double dfB = dfA;
    if (dfS > 1.0) {
        dfB = dfS;
    } else if (dfS > 0.0) {
        dfB = std::sqrt(dfA * dfA - dfS * dfA * dfA);
    }
    if (!(dfB > 0.0) || dfB > dfA) return false;
    *pdfA = dfA;
    *pdfB = dfB;
    return true;
}

void FromDatum(int nDatum, EarthModel* psOut) {
    const DatumEntry& sDatum = kDatums[nDatum];
    psOut->nDatum = nDatum;
    psOut->nSpheroid = sDatum.nSpheroid;
    psOut->dfSemiMajor = kSpheroids[sDatum.nSpheroid].dfSemiMajor;
    psOut->dfSemiMinor = kSpheroids[sDatum.nSpheroid].dfSemiMinor;
    psOut->nEpsgGeographic = sDatum.nEpsgGeographic;
}

void FromSpheroid(int nSpheroid, EarthModel* psOut) {
    psOut->nDatum = -1;
    psOut->nSpheroid = nSpheroid;
    psOut->dfSemiMajor = kSpheroids[nSpheroid].dfSemiMajor;
    psOut->dfSemiMinor = kSpheroids[nSpheroid].dfSemiMinor;
    psOut->nEpsgGeographic = 0;
}

}  // namespace

const SpheroidEntry* FindSpheroid(int nCode) {
    return nCode >= 0 && nCode < kSpheroidCount ? &kSpheroids[nCode] : nullptr;
}

const DatumEntry* FindDatum(int nCode) {
    return nCode >= 0 && nCode < kDatumCount ? &kDatums[nCode] : nullptr;
}

int DatumCount() {
    return kDatumCount;
}

bool ResolveEarthModel(const ProjInfo_t& sInfo, const ParsedGeosys& sParsed, EarthModel* psOut) {
    EarthModel sModel;
    if (sParsed.nEpsg != 0) {
        // The code defines the system whole; parameters cannot override it.
        sModel = LookupEpsg(sParsed.nEpsg).sModel;
    } else if (sInfo.nEarthModelKind == NOVA_EARTH_SPHEROID_PARMS) {
        if (sInfo.adfProjParms[0] == 0.0) {
            if (!FindSpheroid(sInfo.nSpheroid)) return false;
            FromSpheroid(sInfo.nSpheroid, &sModel);
        } else {
            if (!AxesFromParms(sInfo.adfProjParms[0], sInfo.adfProjParms[1], &sModel.dfSemiMajor,
                               &sModel.dfSemiMinor)) {
                return false;
            }
            sModel.nSpheroid = -1;
        }
    } else if (sParsed.cModel == 'D') {
        if (!FindDatum(sParsed.nModelCode)) return false;
        FromDatum(sParsed.nModelCode, &sModel);
    } else if (sParsed.cModel == 'E') {
        if (!FindSpheroid(sParsed.nModelCode)) return false;
        FromSpheroid(sParsed.nModelCode, &sModel);
    } else {
        FromDatum(kWgs84Datum, &sModel);
    }
    *psOut = sModel;
    return true;
}

}  // namespace detail
}  // namespace nova

using nova::detail::EarthModel;
using nova::detail::ParsedGeosys;

bool GetEllipsoidData(const char* pszCode, int* pnIndex, double* pdfSemiMajor,
                      double* pdfSemiMinor) {
    if (pszCode == nullptr) return false;
    ParsedGeosys sParsed;
    if (nova::detail::ParseGeosys(pszCode, nova::detail::kUnboundedText, &sParsed) !=
        nova::detail::GeosysError::kNone) {
        // A bare earth-model code: parse it behind a geographic keyword.
        char szText[32];
        if (std::strlen(pszCode) > 8) return false;
        std::snprintf(szText, sizeof(szText), "LONG %s", pszCode);
        if (nova::detail::ParseGeosys(szText, sizeof(szText), &sParsed) !=
                nova::detail::GeosysError::kNone ||
            sParsed.cModel == '\0') {
            return false;
        }
    }
    ProjInfo_t sInfo{};
    EarthModel sModel;
    if (!nova::detail::ResolveEarthModel(sInfo, sParsed, &sModel)) return false;
    if (pnIndex) *pnIndex = sModel.nSpheroid;
    if (pdfSemiMajor) *pdfSemiMajor = sModel.dfSemiMajor;
    if (pdfSemiMinor) *pdfSemiMinor = sModel.dfSemiMinor;
    return true;
}

namespace nova {
namespace detail {

int NearestSpheroid(double dfSemiMajor, double dfSemiMinor) {
    constexpr double kTolerance = 1e-3;  // metres, on each axis
    int nBest = -1;
    double dfBestDistance = 0.0;
    for (int i = 0; i < nova::detail::kSpheroidCount; ++i) {
        const nova::detail::SpheroidEntry* psEntry = nova::detail::FindSpheroid(i);
        const double dfDa = psEntry->dfSemiMajor - dfSemiMajor;
        const double dfDb = psEntry->dfSemiMinor - dfSemiMinor;
        if (!(std::fabs(dfDa) <= kTolerance && std::fabs(dfDb) <= kTolerance)) continue;
        // The nearest wins, so GRS 1980 and WGS 84 (0.1 mm apart) each find
        // their own code.
        const double dfDistance = std::hypot(dfDa, dfDb);
        if (nBest < 0 || dfDistance < dfBestDistance) {
            nBest = i;
            dfBestDistance = dfDistance;
        }
    }
    return nBest;
}

}  // namespace detail
}  // namespace nova

std::string EllipsoidInfoList::GetEllipsoidCode(double dfSemiMajor, double dfSemiMinor) {
    const int nBest = nova::detail::NearestSpheroid(dfSemiMajor, dfSemiMinor);
    if (nBest < 0) return std::string();
    char szCode[16];
    std::snprintf(szCode, sizeof(szCode), "E%03d", nBest);
    return szCode;
}

int GetEarthModel(const ProjInfo_t* psInfo, char* pszOut) {
    if (pszOut) pszOut[0] = '\0';
    if (psInfo == nullptr || pszOut == nullptr) return -1;
    if (psInfo->nEarthModelKind == NOVA_EARTH_SPHEROID_PARMS) {
        ParsedGeosys sParsed;
        EarthModel sModel;
        if (!nova::detail::ResolveEarthModel(*psInfo, sParsed, &sModel)) return -1;
        const std::string osCode =
            EllipsoidInfoList::GetEllipsoidCode(sModel.dfSemiMajor, sModel.dfSemiMinor);
        if (osCode.empty()) return -1;
        std::snprintf(pszOut, 16, "%s", osCode.c_str());
        return 0;
    }
    ParsedGeosys sParsed;
    if (nova::detail::ParseGeosys(psInfo->szProj, sizeof(psInfo->szProj), &sParsed) !=
        nova::detail::GeosysError::kNone) {
        return -1;
    }
    if (sParsed.nEpsg != 0) {
        // The datum or spheroid of ours that the system's earth model matches.
        const EarthModel& sModel = nova::detail::LookupEpsg(sParsed.nEpsg).sModel;
        if (sModel.nDatum < 0 && sModel.nSpheroid < 0) return -1;
        std::snprintf(pszOut, 16, sModel.nDatum >= 0 ? "D%03d" : "E%03d",
                      sModel.nDatum >= 0 ? sModel.nDatum : sModel.nSpheroid);
    } else if (sParsed.cModel == '\0') {
        std::snprintf(pszOut, 16, "D000");
    } else {
        std::snprintf(pszOut, 16, "%c%03d", sParsed.cModel, sParsed.nModelCode);
    }
    return 0;
}
