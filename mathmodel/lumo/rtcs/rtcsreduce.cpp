// Radar control point reduction and polynomial fits: each control point's
// pixel is moved to where the point would be imaged at the reference height,
// then the ground-to-image and image-to-ground polynomials are fitted.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <string>
#include <vector>

#include "errors.h"
#include "lumo_rtcs.h"
#include "rtcs_earth.h"
#include "rtcs_internal.h"
#include "runtime.h"

namespace {

constexpr int kFitOrder = 2;

// The pixel at which a point dh above the reference height, imaged at
// dfPixel, would lie at the reference height.
double ReducedPixel(const LinePosition* psLines, int nLines, int nPixels, double dfAvgHt,
                    double dfPixel, double dfLine, double dh, double dfMinRel, double dfMaxRel) {
    double dfRangeFirst = 0.0, dfRangeLast = 0.0, adfLat[3], adfLon[3];
    int nOutside = 1;
    RTCSGetPositionInfo(psLines, nLines, dfLine, &dfRangeFirst, &dfRangeLast, adfLat, adfLon,
                        &nOutside);
    if (nOutside != 0) return dfPixel;
    double adfSat[3], adfRadius[3], rng[3], inc[3], adfX[3], adfY[3], adfZ[3];
    double dfSpacing = 0.0;
    int nStatus = -1;
    RTCSCalParameters(dfRangeFirst, dfRangeLast, dfAvgHt, adfSat, adfLat, adfLon, adfRadius, rng,
                      inc, adfX, adfY, adfZ, &dfSpacing, nPixels, &nStatus);
    if (nStatus != 0) return dfPixel;  // no geometry for this line: the point stays
    int nLow = 0, nHigh = 0;
    RTCSParallaxCal(dfRangeFirst, dfRangeLast, adfSat, &adfRadius[0], dfSpacing, dfMinRel, dfMaxRel,
                    &nLow, &nHigh);

    const auto range = [&](double p) { return rng[0] + rng[1] * p + rng[2] * p * p; };
    const auto incidence = [&](double p) { return inc[0] + inc[1] * p + inc[2] * p * p; };
    const double r0 = range(dfPixel);
    const int nDir = dfRangeLast > dfRangeFirst ? 1 : -1;
    const double dfStart = dfPixel - nDir * nLow;
    double dfPrev = r0;
    for (int j = 0; j < nLow + nHigh; ++j) {
        const double p = dfStart + j * nDir;
        const double r = range(p);
        const double d =
            std::sqrt(std::max(0.0, r * r + dh * dh - 2.0 * r * dh * std::cos(incidence(p))));
        if (d > r0) return p - (1.0 - (r0 - dfPrev) / (d - dfPrev)) * nDir;
        dfPrev = d;
    }
    return dfPixel;
}

}  // namespace

namespace lumo::rtcs {

bool ToGeographic(const ProjInfo_t& sProj, double dfX, double dfY, double* pdfLon, double* pdfLat) {
    double x = dfX * sProj.dfXScale + sProj.dfXOffset;
    double y = dfY * sProj.dfYScale + sProj.dfYOffset;
    if (DecodeGeosys(sProj.szProj, nullptr) != NOVA_PROJ_GEOGRAPHIC) {
        // Geographic coordinates on the projection's own earth model.
        char szEarth[32] = "";
        GetEarthModel(&sProj, szEarth);
        char szLong[48];
        std::snprintf(szLong, sizeof szLong, "LONG %s", szEarth);
        ProjInfo_t sGeo{};
        if (Geosys2ProjInfo(&sGeo, szLong, 0.0, 0.0, 1.0, 1.0) < 0 ||
            GCTPTransform(&sProj, x, y, &sGeo, &x, &y) != 0) {
            return false;
        }
    }
    *pdfLon = x;
    *pdfLat = y;
    return std::isfinite(x) && std::isfinite(y) && std::fabs(y) <= 90.0;
}

}  // namespace lumo::rtcs

void RTCSParallaxCal(double dfRangeFirst, double dfRangeLast, const double* padfSatPos,
                     const double* pdfRadius, double dfPixelSpacing, double dfLowRel,
                     double dfHighRel, int* pnLowCount, int* pnHighCount) {
    const double rN = std::min(dfRangeFirst, dfRangeLast);
    const double dfSat = RTCSVectorLength(padfSatPos);
    const double R = *pdfRadius;
    const auto angle = [&](double r) {
        return lumo::rtcs::ClampedAcos((R * R + dfSat * dfSat - r * r) / (2.0 * dfSat * R));
    };
    const double theta0 = angle(rN);
    const double thetaHigh = angle(rN - dfHighRel);
    const double thetaLow = angle(rN - dfLowRel);
    // Counts are bounded so that a degenerate geometry cannot ask for an
    // endless search.
    const auto count = [&](double dfAngle) {
        const double dfPixels = dfAngle * R / dfPixelSpacing;
        if (!(dfPixels >= 0.0)) return 0;
        return static_cast<int>(std::min(dfPixels + 1.0, 1e6));
    };
    *pnHighCount = count(theta0 - thetaHigh);
    *pnLowCount = count(thetaLow - theta0);
}

void RTCSGeoToImg(const LinePosition* psLines, int nPoints, const double* padfLat,
                  const double* padfLon, const double* padfHeight, const double* padfPixel,
                  const double* padfLine, int nPixels, int nLines, double dfMinHeight,
                  double dfMaxHeight, double dfAvgHt, GEOInfo_t* psGeoFwd, GEOInfo_t* psGeoInv) {
    const auto n = static_cast<std::size_t>(std::max(nPoints, 0));
    std::vector<double> adfPixel(n), adfLine(padfLine, padfLine + n), adfLon(n),
        adfLat(padfLat, padfLat + n);
    for (std::size_t i = 0; i < n; ++i) {
        adfPixel[i] =
            ReducedPixel(psLines, nLines, nPixels, dfAvgHt, padfPixel[i], padfLine[i],
                         padfHeight[i] - dfAvgHt, dfMinHeight - dfAvgHt, dfMaxHeight - dfAvgHt);
        // Longitudes continuous across the scene, so that one across the
        // 180th meridian fits like any other.
        adfLon[i] = lumo::rtcs::LongitudeNear(padfLon[i], padfLon[0]);
    }
    char szLon[32] = "LON";
    DecodeGeosys(szLon, szLon);
    int nOrder = kFitOrder;
    GCPRegression2(psGeoFwd, szLon, adfLon.data(), adfLat.data(), "PIXEL", adfPixel.data(),
                   adfLine.data(), nPoints, &nOrder, 0, nullptr, nullptr);
    nOrder = kFitOrder;
    GCPRegression2(psGeoInv, "PIXEL", adfPixel.data(), adfLine.data(), szLon, adfLon.data(),
                   adfLat.data(), nPoints, &nOrder, 0, nullptr, nullptr);
}

void RTCSCalculate(GEOInfo_t* psGeoFwd, GEOInfo_t* psGeoInv, const LinePosition* psLines,
                   int nPoints, ProjInfo_t* psProj, const double* padfPixel, const double* padfLine,
                   const double* padfX, const double* padfY, const double* padfHeight,
                   double dfAvgHt, int nPixels, int nLines) {
    if (psGeoFwd == nullptr || psGeoInv == nullptr || psLines == nullptr || psProj == nullptr ||
        nPoints < 1 || padfPixel == nullptr || padfLine == nullptr || padfX == nullptr ||
        padfY == nullptr || padfHeight == nullptr) {
        lumo::Fatal(lumo::Err::kBadArgument,
                    _("RTCSCalculate: missing control points or fit records."));
    }
    const std::string osLines = lumo::rtcs::CheckLinePositions(*psLines);
    if (!osLines.empty() || psLines->nLines < nLines || !std::isfinite(dfAvgHt)) {
        const std::string osWhy = !osLines.empty()
                                      ? osLines
                                      : nova::FormatString(
                                            "%d lines of positions for %d image lines, average "
                                            "height %g",
                                            psLines->nLines, nLines, dfAvgHt);
        lumo::Fatal(lumo::Err::kBadArgument, MkName("RTCSCalculate: %s.", osWhy.c_str()));
    }
    const auto n = static_cast<std::size_t>(nPoints);
    std::vector<double> adfLon(n), adfLat(n);
    for (std::size_t i = 0; i < n; ++i) {
        const int nNumber = static_cast<int>(i) + 1;
        if (!std::isfinite(padfX[i]) || !std::isfinite(padfY[i]) || !std::isfinite(padfHeight[i])) {
            lumo::Fatal(lumo::Err::kBadArgument,
                        MkName("RTCSCalculate: control point %d (%g, %g, %g) is not finite.",
                               nNumber, padfX[i], padfY[i], padfHeight[i]));
        }
        if (!lumo::rtcs::ToGeographic(*psProj, padfX[i], padfY[i], &adfLon[i], &adfLat[i])) {
            lumo::Fatal(lumo::Err::kBadArgument,
                        MkName("RTCSCalculate: control point %d (%g, %g) cannot be converted "
                               "from %s to geographic coordinates.",
                               nNumber, padfX[i], padfY[i], psProj->szProj));
        }
    }
    for (std::size_t i = 0; i < n; ++i) {
        const int nNumber = static_cast<int>(i) + 1;
        if (!(padfPixel[i] >= 0.0 && padfPixel[i] <= nPixels)) {
            lumo::FatalReal(lumo::Err::kImageRange, "X_img", padfPixel[i], nNumber);
        }
        if (!(padfLine[i] >= 0.0 && padfLine[i] <= nLines)) {
            lumo::FatalReal(lumo::Err::kImageRange, "Y_img", padfLine[i], nNumber);
        }
    }
    double dfMin = 1e6, dfMax = -1e6;
    for (std::size_t i = 0; i < n; ++i) {
        dfMin = std::min(dfMin, padfHeight[i]);
        dfMax = std::max(dfMax, padfHeight[i]);
    }
    RTCSGeoToImg(psLines, nPoints, adfLat.data(), adfLon.data(), padfHeight, padfPixel, padfLine,
                 nPixels, nLines, dfMin, dfMax, dfAvgHt, psGeoFwd, psGeoInv);
}
