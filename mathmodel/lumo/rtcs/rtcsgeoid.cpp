// The geoid of radar models whose heights are above mean sea level: a small
// grid of undulations over the scene, sampled once from the host's global
// geoid model, so that every transform converts heights cheaply.
#include <algorithm>
#include <cmath>

#include "dem.h"
#include "errors.h"
#include "rtcs_internal.h"
#include "runtime.h"

namespace lumo::rtcs {
namespace {

// The EGM96 grid has 15' nodes; a 0.05 degree grid interpolated bilinearly
// on top of it reproduces it to millimetres.
constexpr double kGeoidStep = 0.05;
constexpr double kGeoidMargin = 0.5;  // degrees around the scene's positions
constexpr int kGeoidCacheMegabytes = 4;

}  // namespace

double EllipsoidalHeight(const RTCSInfo_t& sModel, double dfLon, double dfLat, double dfHeight) {
    const RTCSGeoidGrid& g = sModel.sGeoid;
    if (g.adfUndulation.empty()) return dfHeight;
    // Positions off the grid take its nearest edge: the geoid varies by
    // metres over hundreds of kilometres.
    const double x =
        std::clamp(std::remainder(dfLon - g.dfLon0, 360.0) / g.dfStep, 0.0, g.nCols - 1.0);
    const double y = std::clamp((dfLat - g.dfLat0) / g.dfStep, 0.0, g.nRows - 1.0);
    if (!std::isfinite(x) || !std::isfinite(y)) return dfHeight;
    const int i = std::min(static_cast<int>(x), g.nCols - 2);
    const int j = std::min(static_cast<int>(y), g.nRows - 2);
    const double fx = x - i, fy = y - j;
    const double* n = g.adfUndulation.data() + static_cast<std::size_t>(j) * g.nCols + i;
    const double dfN = (1 - fy) * ((1 - fx) * n[0] + fx * n[1]) +
                       fy * ((1 - fx) * n[g.nCols] + fx * n[g.nCols + 1]);
    return dfHeight + dfN;
}

void BuildGeoidGrid(RTCSInfo_t* psModel) {
    const LinePosition& s = psModel->psCOpt->sLines;
    const double dfLonRef = s.padfLonMid[s.nLines / 2];
    double lonMin = dfLonRef, lonMax = dfLonRef, latMin = 90.0, latMax = -90.0;
    for (int k = 0; k < s.nLines; ++k) {
        for (const double* padfLon : {s.padfLonFirst, s.padfLonLast}) {
            const double dfLon = LongitudeNear(padfLon[k], dfLonRef);
            lonMin = std::min(lonMin, dfLon);
            lonMax = std::max(lonMax, dfLon);
        }
        for (const double* padfLat : {s.padfLatFirst, s.padfLatLast}) {
            latMin = std::min(latMin, padfLat[k]);
            latMax = std::max(latMax, padfLat[k]);
        }
    }
    nova::dem::DEMPtr poGeoid(nova::dem::DEMFactory::CreateGlobalDEM(true, kGeoidCacheMegabytes));
    if (!poGeoid) {
        Fatal(Err::kBadArgument,
              _("Radar model: heights above mean sea level need the EGM96 geoid grid, which is "
                "not installed (proj-data)."));
    }
    RTCSGeoidGrid g;
    g.dfStep = kGeoidStep;
    g.dfLon0 = lonMin - kGeoidMargin;
    g.dfLat0 = std::max(-90.0, latMin - kGeoidMargin);
    g.nCols = static_cast<int>(std::ceil((lonMax - lonMin + 2 * kGeoidMargin) / kGeoidStep)) + 1;
    g.nRows = static_cast<int>(
                  std::ceil((std::min(90.0, latMax + kGeoidMargin) - g.dfLat0) / kGeoidStep)) +
              1;
    g.adfUndulation.resize(static_cast<std::size_t>(g.nCols) * g.nRows);
    for (int j = 0; j < g.nRows; ++j) {
        for (int i = 0; i < g.nCols; ++i) {
            const double dfLon = std::remainder(g.dfLon0 + i * kGeoidStep, 360.0);
            const double dfLat = std::min(90.0, g.dfLat0 + j * kGeoidStep);
            double dfN = 0.0;
            if (!poGeoid->GetHeight(dfLon, dfLat, dfN)) {
                Fatal(Err::kBadArgument,
                      MkName("RTCSGenModel: no geoid height at longitude %g, latitude %g.", dfLon,
                             dfLat));
            }
            g.adfUndulation[static_cast<std::size_t>(j) * g.nCols + i] = dfN;
        }
    }
    psModel->sGeoid = std::move(g);
}

}  // namespace lumo::rtcs
