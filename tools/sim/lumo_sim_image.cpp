#include "lumo_sim_image.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <thread>
#include <utility>

namespace lumo::sim {
namespace {

constexpr int kMaxIterations = 60;
constexpr double kHeightTolerance = 1e-4;  // metres
// Heights, around the starting one, of the two points that fix the line of
// sight.
constexpr double kRayHalfSpan = 500.0;
constexpr double kDeg = M_PI / 180.0;

Ecef Along(const Ecef& sA, const Ecef& sB, double dfT) {
    return {sA.x + dfT * (sB.x - sA.x), sA.y + dfT * (sB.y - sA.y), sA.z + dfT * (sB.z - sA.z)};
}

}  // namespace

bool SeeTerrain(const Scene& oScene, double dfPixel, double dfLine, const TerrainFn& fnTerrain,
                double dfStartZ, SimPoint* psOut) {
    // The line of sight is straight: two of its points fix it, and the
    // search runs along it on g(t) = height(t) - terrain(t) by secant steps.
    Ecef sLow{}, sHigh{};
    if (!oScene.ImageToEcef(dfPixel, dfLine, dfStartZ - kRayHalfSpan, &sLow) ||
        !oScene.ImageToEcef(dfPixel, dfLine, dfStartZ + kRayHalfSpan, &sHigh)) {
        return false;
    }
    static const ProjInfo_t sGeo = [] {
        ProjInfo_t sInfo{};
        Geosys2ProjInfo(&sInfo, "LONG/LAT D000", 0.0, 0.0, 1.0, 1.0);
        return sInfo;
    }();
    auto Gap = [&](double dfT, SimPoint* psPoint) {
        double dfLat = 0.0, dfLon = 0.0, dfH = 0.0, dfTerrain = 0.0;
        EcefToGeodetic(Along(sLow, sHigh, dfT), &dfLat, &dfLon, &dfH);
        if (GCTPTransform(&sGeo, dfLon / kDeg, dfLat / kDeg, &oScene.Projection(), &psPoint->dfX,
                          &psPoint->dfY) != 0 ||
            !fnTerrain(psPoint->dfX, psPoint->dfY, &dfTerrain)) {
            return std::numeric_limits<double>::quiet_NaN();
        }
        psPoint->dfZ = dfH;
        return dfH - dfTerrain;
    };
    SimPoint sPoint{dfPixel, dfLine, 0.0, 0.0, 0.0};
    double dfT0 = 0.5;
    double dfG0 = Gap(dfT0, &sPoint);
    double dfT1 = 0.5 + 1.0 / (2.0 * kRayHalfSpan);  // a metre higher
    for (int i = 0; i < kMaxIterations && std::isfinite(dfG0); ++i) {
        const double dfG1 = Gap(dfT1, &sPoint);
        if (!std::isfinite(dfG1)) return false;
        if (std::fabs(dfG1) < kHeightTolerance) {
            *psOut = sPoint;
            return true;
        }
        const double dfSlope = (dfG1 - dfG0) / (dfT1 - dfT0);
        if (!(std::fabs(dfSlope) > 0.0)) return false;
        dfT0 = dfT1;
        dfG0 = dfG1;
        dfT1 -= dfG1 / dfSlope;
    }
    return false;
}

std::vector<float> RenderImage(const Scene& oScene, const TerrainFn& fnTerrain,
                               const RadianceFn& fnRadiance) {
    const int nPixels = oScene.Params().nPixels;
    const int nLines = oScene.Params().nLines;
    std::vector<float> afImage(static_cast<std::size_t>(nPixels) * nLines,
                               std::numeric_limits<float>::quiet_NaN());
    // Rows are independent: interleaved over a few threads.
    const int nThreads = static_cast<int>(std::clamp(std::thread::hardware_concurrency(), 1U, 4U));
    auto RenderRows = [&](int nFirst) {
        double dfStartZ = 0.0;
        for (int nLine = nFirst; nLine < nLines; nLine += nThreads) {
            for (int nPixel = 0; nPixel < nPixels; ++nPixel) {
                SimPoint sSeen{};
                // Neighbouring pixels see nearly the same height: start there.
                if (!SeeTerrain(oScene, nPixel + 0.5, nLine + 0.5, fnTerrain, dfStartZ, &sSeen)) {
                    continue;
                }
                dfStartZ = sSeen.dfZ;
                afImage[static_cast<std::size_t>(nLine) * nPixels + nPixel] =
                    static_cast<float>(fnRadiance(sSeen.dfX, sSeen.dfY));
            }
        }
    };
    std::vector<std::thread> aoThreads;
    for (int t = 1; t < nThreads; ++t) aoThreads.emplace_back(RenderRows, t);
    RenderRows(0);
    for (std::thread& oThread : aoThreads) oThread.join();
    return afImage;
}

RadianceFn MarkedGround(std::vector<GroundMark> asMarks, double dfSigma, double dfBackground,
                        double dfPeak) {
    const double dfScale = -0.5 / (dfSigma * dfSigma);
    return [asMarks = std::move(asMarks), dfScale, dfBackground, dfPeak](double dfX, double dfY) {
        double dfValue = dfBackground;
        for (const GroundMark& sMark : asMarks) {
            const double dfDX = dfX - sMark.dfX;
            const double dfDY = dfY - sMark.dfY;
            dfValue += dfPeak * std::exp(dfScale * (dfDX * dfDX + dfDY * dfDY));
        }
        return dfValue;
    };
}

}  // namespace lumo::sim
