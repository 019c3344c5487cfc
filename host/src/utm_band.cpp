// The latitude band of a UTM text against the points given in it. The
// letter after a UTM zone is a latitude band, so "UTM 21 S" is band S in the
// north; a southern-hemisphere user who meant "south" gets positions some
// thousands of kilometres away without any error. The check below finds
// points far outside their band and says how to write what was probably
// meant.

#include <cmath>
#include <cstdio>
#include <cstring>
#include <string>

#include "proj_definition.h"
#include "projection.h"

namespace {

constexpr char kBands[] = "CDEFGHJKLMNPQRSTUVWX";
// Points more than one band beyond their band's latitudes are "far outside".
constexpr double kMarginDegrees = 8.0;

std::string Latitude(double dfLat) {
    char szText[32];
    std::snprintf(szText, sizeof(szText), "%.1f %c", std::fabs(dfLat), dfLat < 0.0 ? 'S' : 'N');
    return szText;
}

// Longitude and latitude of a ground point of a description, on its own
// earth model; false when it cannot be had.
bool ToGeographic(const ProjInfo_t& sInfo, double dfX, double dfY, double* pdfLon, double* pdfLat) {
    char szModel[16];
    if (GetEarthModel(&sInfo, szModel) != 0) return false;
    ProjInfo_t sGeo;
    const std::string osGeo = std::string("LONG/LAT ") + szModel;
    if (Geosys2ProjInfo(&sGeo, osGeo.c_str(), 0.0, 0.0, 1.0, 1.0) != 0) return false;
    return GCTPTransform(&sInfo, dfX, dfY, &sGeo, pdfLon, pdfLat) == 0;
}

// The same zone and earth model in the other hemisphere, written with the
// band letter that the ground point (dfX, dfY) has there, with that
// latitude and, on WGS 84, the EPSG code; empty when there is none.
std::string OtherHemisphereText(const nova::detail::ParsedGeosys& sParsed, double dfX, double dfY,
                                std::string* posLatitude, std::string* posEpsg) {
    const int nZone = std::abs(sParsed.nZone);
    std::string osModel;
    if (sParsed.cModel != '\0') {
        char szModel[16];
        std::snprintf(szModel, sizeof(szModel), " %c%03d", sParsed.cModel, sParsed.nModelCode);
        osModel = szModel;
    }
    // Any band of the other hemisphere selects it; the point then names its own.
    const char cOther = sParsed.nZone > 0 ? 'M' : 'N';
    ProjInfo_t sOther;
    const std::string osOther = "UTM " + std::to_string(nZone) + " " + cOther + osModel;
    double dfLon = 0.0, dfLat = 0.0;
    if (Geosys2ProjInfo(&sOther, osOther.c_str(), 0.0, 0.0, 1.0, 1.0) != 0 ||
        !ToGeographic(sOther, dfX, dfY, &dfLon, &dfLat)) {
        return std::string();
    }
    int nPointZone = 0;
    char cBand = 'Z';
    if (UTMZone(dfLon, dfLat, &nPointZone, &cBand) != 0 || cBand == 'Z') return std::string();
    *posLatitude = Latitude(dfLat);
    const bool bWgs84 = osModel.empty() || osModel == " D000";
    if (bWgs84) *posEpsg = "EPSG:" + std::to_string((cBand < 'N' ? 32700 : 32600) + nZone);
    return "UTM " + std::to_string(nZone) + " " + cBand + osModel;
}

}  // namespace

std::string CheckUTMBand(const ProjInfo_t* psInfo, const double* padfX, const double* padfY,
                         int nCount) {
    if (psInfo == nullptr || padfX == nullptr || padfY == nullptr || nCount <= 0) return "";
    nova::detail::ParsedGeosys sParsed;
    if (nova::detail::ParseGeosys(psInfo->szProj, sizeof(psInfo->szProj), &sParsed) !=
            nova::detail::GeosysError::kNone ||
        sParsed.nKind != NOVA_PROJ_UTM || sParsed.cBand == '\0') {
        return "";
    }
    double dfSumX = 0.0, dfSumY = 0.0;
    int nFinite = 0;
    for (int i = 0; i < nCount; ++i) {
        if (!std::isfinite(padfX[i]) || !std::isfinite(padfY[i])) continue;
        dfSumX += padfX[i];
        dfSumY += padfY[i];
        ++nFinite;
    }
    if (nFinite == 0) return "";
    double dfLon = 0.0, dfLat = 0.0;
    const double dfX = dfSumX / nFinite, dfY = dfSumY / nFinite;
    if (!ToGeographic(*psInfo, dfX, dfY, &dfLon, &dfLat)) return "";

    const int nBand = static_cast<int>(std::strchr(kBands, sParsed.cBand) - kBands);
    const double dfSouth = -80.0 + 8.0 * nBand;
    const double dfNorth = dfSouth + (sParsed.cBand == 'X' ? 12.0 : 8.0);
    if (dfLat >= dfSouth - kMarginDegrees && dfLat <= dfNorth + kMarginDegrees) return "";

    std::string osAdvice = "\"" + std::string(sParsed.szNormalised) +
                           "\": the points lie near latitude " + Latitude(dfLat) +
                           ", far outside latitude band " + sParsed.cBand + " (" +
                           Latitude(dfSouth) + " to " + Latitude(dfNorth) +
                           "). The letter after the zone is a latitude band, not a hemisphere: "
                           "bands C to M lie south of the equator, N to X north of it.";
    std::string osLatitude, osEpsg;
    const std::string osOther = OtherHemisphereText(sParsed, dfX, dfY, &osLatitude, &osEpsg);
    if (!osOther.empty()) {
        osAdvice += std::string(" If the points are in the ") +
                    (sParsed.nZone > 0 ? "southern" : "northern") + " hemisphere (near latitude " +
                    osLatitude + "), write \"" + osOther + "\"" +
                    (osEpsg.empty() ? "" : " or \"" + osEpsg + "\"") + ".";
    }
    return osAdvice;
}
