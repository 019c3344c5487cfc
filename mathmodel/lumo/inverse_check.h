// The rule every iterative inverse of the library follows: keep the family's
// own stop rule, then verify the answer by projecting it forward, and accept
// it only when it lands within the tolerance of the point asked for;
// otherwise the family's failure values and a failure status are returned.
#pragma once

#include <cmath>

namespace lumo {

// Largest distance, in pixels along each image axis, between the image point
// asked for and the forward projection of an inverse's answer.
constexpr double kInverseTolerancePixels = 1e-3;

// True when both differences lie within the tolerance (false for NaN).
inline bool WithinInverseTolerance(double dfPixelDiff, double dfLineDiff,
                                   double dfTolerance = kInverseTolerancePixels) {
    return std::fabs(dfPixelDiff) <= dfTolerance && std::fabs(dfLineDiff) <= dfTolerance;
}

}  // namespace lumo
