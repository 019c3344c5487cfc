// Shared pieces of the low-resolution orbit model's sources: angle
// reduction, the mapping ellipsoid and the scanner relations.
#pragma once

#include <cmath>

#include "angles.h"
#include "lumo_lrs.h"

namespace lumo::lrs {

using lumo::kDegToRad;
using lumo::kPi;
using lumo::kRadToDeg;
using lumo::kTwoPi;
constexpr double kSecondsPerDay = 86400.0;

// Squares of the mapping ellipsoid's axes (km^2), as the mapping uses them.
constexpr double kEllA2 = 40680631.59076899;
constexpr double kEllB2 = 40408295.989504;

// x reduced into [0, 2 pi): the remainder of fmod, plus 2 pi when negative.
inline double WrapTwoPi(double x) {
    const double r = std::fmod(x, kTwoPi);
    return r < 0.0 ? r + kTwoPi : r;
}

// x brought into [-pi, pi).
inline double WrapPi(double x) {
    return WrapTwoPi(x + kPi) - kPi;
}

// Scan angle (rad) of a pixel and model time of an image point.
inline double ScanAngle(const LRSSensorModel_t& s, double dfPixel) {
    return (dfPixel - s.dfRefPixel) * s.dfScanAngleStep + s.dfScanAngle0;
}
inline double ImageTime(const LRSSensorModel_t& s, double dfPixel, double dfLine) {
    return (dfLine - s.dfRefLine) * s.dfLineInterval + s.dfTimeOffset + s.dfSampleTimeOffset +
           (dfPixel - s.dfRefPixel) * s.dfSampleInterval;
}

// Unit vector of (x/a^2, y/a^2, z/b^2): the ellipsoid's outward normal at a
// point of its surface.
void SurfaceNormal(const double* padfGround, double* padfNormal);

}  // namespace lumo::lrs

namespace lumo::lrs {

// Orbit and times read from a segment by the model's set-up.
struct OrbitSetup {
    int nYear = 0;             // epoch year
    double dfEpochSec = 0.0;   // start of the epoch year to the element epoch (s)
    double dfStart = 0.0;      // element epoch to the first scan line (s)
    double dfEnd = 0.0;        // element epoch to the last scan line (s)
    int nLines = 0;            // scan lines
    double dfGreenwich = 0.0;  // Greenwich angle at the epoch (rad)
    double adfElements[LRS_NUM_ELEMENTS] = {};
};

// Reads and checks the orbit header, the scan-line times and the elements of
// a segment; prints the set-up's user messages. Raises fatal error 11
// naming the field for anything that cannot give a model.
OrbitSetup ReadOrbitSetup(const EphemerisSeg_t& sSeg);

// Checks mean elements against the theory's range; apszNames name the six
// values in messages.
void CheckMeanElements(const double* padfElements, const char* const* papszNames);

}  // namespace lumo::lrs

namespace lumo::lrs {

// The nine refinement values of a model in their filter order: node, mean
// anomaly and semi-major axis corrections, roll rate and offset, pitch rate
// and offset, yaw rate and offset.
constexpr int kRefinementSize = 9;
void GetRefinement(const LRSOrbitModel_t& m, double* padfValues);
void SetRefinement(LRSOrbitModel_t& m, const double* padfValues);

// The direct state computation of CalcEcrOrbitState with the refinement
// values padfValues in place of the model's own.
void OrbitStateWith(const LRSOrbitModel_t& m, const double* padfValues, double dfTime,
                    double* padfPos, double* padfRot);

}  // namespace lumo::lrs
