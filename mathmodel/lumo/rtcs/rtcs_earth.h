// Shared numerics of the radar model: the WGS 84 local radius on which the
// model's sphere-like Earth is raised by the scene's average height, and
// small vector helpers on plain arrays.
#pragma once

#include <cmath>

#include "angles.h"

namespace lumo::rtcs {

using lumo::kDegToRad;
using lumo::kPi;
using lumo::kRadToDeg;

// WGS 84 equatorial radius, the squared ratio of polar to equatorial radius
// and its square: the radius at latitude phi is
// a * sqrt((q sin² phi + cos² phi) / (p sin² phi + cos² phi)).
constexpr double kEquatorialRadius = 6378137.0;
constexpr double kAxisRatioSquared = 0.9933056200098024;
constexpr double kAxisRatioFourth = 0.986656054743058;

// Distance from the Earth's centre to the WGS 84 ellipsoid at the geodetic
// latitude dfLat (radians).
inline double EarthRadius(double dfLat) {
    const double s2 = std::sin(dfLat) * std::sin(dfLat);
    const double c2 = std::cos(dfLat) * std::cos(dfLat);
    return kEquatorialRadius *
           std::sqrt((kAxisRatioFourth * s2 + c2) / (kAxisRatioSquared * s2 + c2));
}

// The model's ground point: latitude and longitude (radians) taken as
// spherical angles at radius dfRadius.
inline void SpherePoint(double dfLat, double dfLon, double dfRadius, double* padfXYZ) {
    padfXYZ[0] = dfRadius * std::cos(dfLon) * std::cos(dfLat);
    padfXYZ[1] = dfRadius * std::sin(dfLon) * std::cos(dfLat);
    padfXYZ[2] = dfRadius * std::sin(dfLat);
}

inline double Dot(const double* a, const double* b) {
    return a[0] * b[0] + a[1] * b[1] + a[2] * b[2];
}

inline double Length(const double* a) {
    return std::sqrt(Dot(a, a));
}

// arccos of a cosine that may stray outside [-1, 1] by rounding.
inline double ClampedAcos(double dfCosine) {
    return std::acos(dfCosine < -1.0 ? -1.0 : (dfCosine > 1.0 ? 1.0 : dfCosine));
}

}  // namespace lumo::rtcs
