// Small shared numerics of the simulators: WGS 84 and orbit constants,
// Earth-fixed vector helpers, parameter checks and a platform-independent
// random stream.
#pragma once

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <random>
#include <stdexcept>
#include <string>
#include <vector>

#include "lumo_sim.h"

namespace lumo::sim {

constexpr double kPi = 3.14159265358979323846;
constexpr double kDeg = kPi / 180.0;
constexpr double kSemiMajor = 6378137.0;  // WGS 84
constexpr double kFlattening = 1.0 / 298.257223563;
constexpr double kEcc2 = kFlattening * (2.0 - kFlattening);
constexpr double kGM = 3.986004418e14;         // m^3/s^2
constexpr double kEarthRate = 7.292115841e-5;  // rad/s

inline Ecef Add(const Ecef& a, const Ecef& b) {
    return {a.x + b.x, a.y + b.y, a.z + b.z};
}
inline Ecef Sub(const Ecef& a, const Ecef& b) {
    return {a.x - b.x, a.y - b.y, a.z - b.z};
}
inline Ecef Scale(const Ecef& a, double s) {
    return {a.x * s, a.y * s, a.z * s};
}
inline double Dot(const Ecef& a, const Ecef& b) {
    return a.x * b.x + a.y * b.y + a.z * b.z;
}
inline Ecef Cross(const Ecef& a, const Ecef& b) {
    return {a.y * b.z - a.z * b.y, a.z * b.x - a.x * b.z, a.x * b.y - a.y * b.x};
}
inline Ecef Unit(const Ecef& a) {
    return Scale(a, 1.0 / std::sqrt(Dot(a, a)));
}
inline double Distance(const Ecef& a, const Ecef& b) {
    const Ecef d = Sub(a, b);
    return std::sqrt(Dot(d, d));
}

// Inertial vector seen in the Earth-fixed frame after the Earth turned for
// dfTime seconds (the frames coincide at the centre line).
inline Ecef ToEarthFixed(const Ecef& a, double dfTime) {
    const double th = kEarthRate * dfTime;
    return {std::cos(th) * a.x + std::sin(th) * a.y, -std::sin(th) * a.x + std::cos(th) * a.y, a.z};
}

// Refuses a parameter, named in the words of the simulator's user.
inline void Require(bool bOk, const char* pszName, double dfValue, const char* pszRule) {
    if (bOk) return;
    char szValue[32];
    std::snprintf(szValue, sizeof(szValue), "%.10g", dfValue);
    throw std::invalid_argument(std::string(pszName) + " " + szValue + ": " + pszRule);
}

// Uniform in [0, 1) from a 32-bit generator, the same on every platform.
inline double Uniform(std::mt19937& sGen) {
    return static_cast<double>(sGen()) / 4294967296.0;
}

inline double Gaussian(std::mt19937& sGen) {
    const double u1 = 1.0 - Uniform(sGen);  // (0, 1]
    const double u2 = Uniform(sGen);
    return std::sqrt(-2.0 * std::log(u1)) * std::cos(2.0 * kPi * u2);
}

// Image positions of nPoints points on a jittered grid over an image of
// nPixels x nLines (a fraction dfMargin kept free at every edge) with heights
// uniform in [dfMinHeight, dfMaxHeight]; ground coordinates are left 0.
// Reproducible from nSeed.
inline std::vector<SimPoint> JitteredImagePoints(int nPoints, std::uint32_t nSeed, int nPixels,
                                                 int nLines, double dfMinHeight, double dfMaxHeight,
                                                 double dfMargin) {
    Require(nPoints >= 0 && nPoints <= 10000000, "point count", nPoints, "must lie in [0, 1e7]");
    Require(std::isfinite(dfMinHeight) && dfMinHeight > -1000.0 && dfMinHeight < 10000.0,
            "minimum height", dfMinHeight, "must lie within (-1000, 10000) metres");
    Require(std::isfinite(dfMaxHeight) && dfMaxHeight > -1000.0 && dfMaxHeight < 10000.0,
            "maximum height", dfMaxHeight, "must lie within (-1000, 10000) metres");
    Require(dfMinHeight <= dfMaxHeight, "minimum height", dfMinHeight,
            "must not exceed the maximum height");
    Require(dfMargin >= 0.0 && dfMargin < 0.5, "margin", dfMargin, "must lie in [0, 0.5)");
    std::mt19937 sGen(nSeed);
    const int nCols = std::max(1, static_cast<int>(std::ceil(std::sqrt(nPoints))));
    const int nRows = std::max(1, (nPoints + nCols - 1) / nCols);
    const double dfWidth = nPixels * (1.0 - 2.0 * dfMargin);
    const double dfHeightLines = nLines * (1.0 - 2.0 * dfMargin);
    std::vector<SimPoint> asPoints;
    asPoints.reserve(static_cast<std::size_t>(nPoints));
    for (int k = 0; k < nPoints; ++k) {
        // The last row may be short: spread its cells over the full width.
        const int nRow = k / nCols;
        const int nInRow = nRow == nRows - 1 ? nPoints - nRow * nCols : nCols;
        const int nCol = k % nCols;
        SimPoint s{};
        s.dfPixel = nPixels * dfMargin + (nCol + Uniform(sGen)) * dfWidth / nInRow;
        s.dfLine = nLines * dfMargin + (nRow + Uniform(sGen)) * dfHeightLines / nRows;
        s.dfZ = dfMinHeight + (dfMaxHeight - dfMinHeight) * Uniform(sGen);
        asPoints.push_back(s);
    }
    return asPoints;
}

// Jittered points over a scene's image (as JitteredImagePoints) placed on the
// ground by the scene's own ImageToGround; throws naming the first point
// that misses the ground. pszWhat names the points in that message.
template <class SceneT>
std::vector<SimPoint> SampleScenePoints(const SceneT& oScene, int nPoints, std::uint32_t nSeed,
                                        int nPixels, int nLines, double dfMinHeight,
                                        double dfMaxHeight, double dfMargin, const char* pszWhat) {
    std::vector<SimPoint> asPoints =
        JitteredImagePoints(nPoints, nSeed, nPixels, nLines, dfMinHeight, dfMaxHeight, dfMargin);
    for (std::size_t k = 0; k < asPoints.size(); ++k) {
        SimPoint& s = asPoints[k];
        if (!oScene.ImageToGround(s.dfPixel, s.dfLine, s.dfZ, &s.dfX, &s.dfY)) {
            throw std::runtime_error(std::string(pszWhat) + " " + std::to_string(k) +
                                     " cannot be mapped to the ground");
        }
    }
    return asPoints;
}

}  // namespace lumo::sim
