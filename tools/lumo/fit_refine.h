// Control point residuals of a fit, each point's leave-one-out residual,
// and the refinement that drops blunders one at a time (`--refine`). Every
// fitting command hands in its fit as a function of the points to use, so
// the rules are one for every family.
#pragma once

#include <functional>
#include <iosfwd>
#include <string>
#include <vector>

#include "points_io.h"

namespace lumo::cli {

// Fits the model to the points whose flag in `use` is set and predicts the
// image position of every point (all of them, used or not). False when the
// fit failed (too few points, a singular system).
using ImageFit = std::function<bool(const std::vector<char>& use, std::vector<double>& pixel,
                                    std::vector<double>& line)>;

// `--refine TOLERANCE[,MIN_POINTS]`.
struct RefineOptions {
    bool bEnabled = false;
    double dfTolerance = 0.0;  // pixels
    int nMinPoints = 0;        // 0: the fit's least number of points plus one
};

// Parses the option's text; fails naming the bad value.
RefineOptions ParseRefine(const std::string& text);

struct PointResidual {
    double dfPixel = 0.0, dfLine = 0.0;        // measured minus fitted, the point in the fit
    double dfLooPixel = 0.0, dfLooLine = 0.0;  // measured minus the fit without the point
    bool bLoo = false;                         // the fit without the point succeeded
    bool bDropped = false;  // dropped by the refinement: residuals are of the final fit
};

struct FitResiduals {
    std::vector<PointResidual> asPoints;
    std::vector<std::size_t> anDropped;  // in the order they were dropped
    std::vector<char> use;               // the points of the final fit
    bool bFitted = false;                // the final fit succeeded: the residuals hold
};

// Residuals and leave-one-out residuals of `fit` on the control points;
// with refinement enabled, first drops the point with the largest
// leave-one-out distance beyond the tolerance and refits, until none is
// beyond it or the minimum number of points is left. nLeast is the fit's
// least number of points. When the final fit fails the caller's own fit
// reports why. Progress on a terminal is labelled with `command`.
FitResiduals RefineAndMeasure(const ImageFit& fit, const PointSet& gcps, int nLeast,
                              const RefineOptions& options,
                              const std::string& command = "lumo fit");

// The table of each point's residuals, with the dropped points marked and
// listed, on `out`; nothing without a final fit.
void PrintPointResiduals(std::ostream& out, const PointSet& gcps, const FitResiduals& residuals);

// Control points as the parallel arrays the library's fits take (ground
// coordinates as the set holds them).
struct ControlArrays {
    std::vector<double> pixel, line, x, y, z;
    int Count() const { return static_cast<int>(pixel.size()); }
};
ControlArrays ToArrays(const PointSet& gcps);

// The points whose flag in `use` is set, in order.
ControlArrays Subset(const ControlArrays& c, const std::vector<char>& use);

// The control points of the final fit.
PointSet KeptPoints(const PointSet& gcps, const FitResiduals& residuals);

}  // namespace lumo::cli
