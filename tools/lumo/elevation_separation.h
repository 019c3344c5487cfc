// How well an image's control points separate the rigorous model's
// elevation terms from its planimetric ones.
//
// In the adjustment the across-track elevation term P4 multiplies
// u^2 / P3 - H and the along-track one P7 multiplies H (H the elevation less
// the Earth's curvature drop, u the across-track ground distance), while the
// planimetric terms take what is linear in the image position. When over
// an image's control points either column lies near a plane in the image
// position, the adjustment cannot tell that term from the others: its error
// reaches points at other heights amplified by their height spread over the
// column's out-of-plane spread. With four control points for eight
// unknowns that happens to many random point sets, and tie points of
// estimated elevation do not mend it. `lumo block` holds such images near
// their orbit values (the segment's constraint flag).
//
// Header only, so that the block benchmark measures the same rule.
#pragma once

#include <algorithm>
#include <cmath>
#include <vector>

#include "lumo_ephemeris.h"

namespace lumo::cli {

// The out-of-plane spread of each elevation column over the control points,
// divided by the spread of their heights (RMS about the mean); 0 when the
// heights do not vary or the points do not span the image in two
// directions.
struct ElevationSeparation {
    double dfAcross = 0.0;
    double dfAlong = 0.0;
    double Weakest() const { return std::min(dfAcross, dfAlong); }
};

// Below this an error of the elevation terms reaches points of ordinary
// height amplified more than threefold.
constexpr double kWeakSeparation = 1.0 / 3.0;

struct ControlSample {
    double dfPixel = 0.0, dfLine = 0.0, dfZ = 0.0;
};

namespace separation_detail {

// RMS residual of v fitted by a + b x + c y; negative when (x, y) do not
// span a plane.
inline double PlaneResidual(const std::vector<double>& x, const std::vector<double>& y,
                            const std::vector<double>& v) {
    const auto n = static_cast<double>(v.size());
    double mx = 0.0, my = 0.0, mv = 0.0;
    for (std::size_t i = 0; i < v.size(); ++i) {
        mx += x[i] / n;
        my += y[i] / n;
        mv += v[i] / n;
    }
    double sxx = 0.0, sxy = 0.0, syy = 0.0, sxv = 0.0, syv = 0.0;
    for (std::size_t i = 0; i < v.size(); ++i) {
        const double dx = x[i] - mx, dy = y[i] - my, dv = v[i] - mv;
        sxx += dx * dx;
        sxy += dx * dy;
        syy += dy * dy;
        sxv += dx * dv;
        syv += dy * dv;
    }
    const double det = sxx * syy - sxy * sxy;
    if (!(det > 1e-9 * sxx * syy)) return -1.0;  // collinear, or fewer than 3 places
    const double b = (syy * sxv - sxy * syv) / det;
    const double c = (sxx * syv - sxy * sxv) / det;
    double sum = 0.0;
    for (std::size_t i = 0; i < v.size(); ++i) {
        const double r = (v[i] - mv) - b * (x[i] - mx) - c * (y[i] - my);
        sum += r * r;
    }
    return std::sqrt(sum / n);
}

}  // namespace separation_detail

// The separation of an image's control points (pixel, line, height), with
// the across-track geometry taken from its segment: the orbit height over
// the Earth's equatorial radius, the view and pitch angles, the angle of a
// pixel.
inline ElevationSeparation SeparationOf(const EphemerisSeg_t& segment,
                                        const std::vector<ControlSample>& points) {
    constexpr double kEarthRadius = 6378137.0;
    const std::size_t n = points.size();
    if (n < 3) return {};
    double mean = 0.0;
    for (const ControlSample& p : points) mean += p.dfZ / static_cast<double>(n);
    double spread = 0.0;
    for (const ControlSample& p : points) spread += (p.dfZ - mean) * (p.dfZ - mean);
    spread = std::sqrt(spread / static_cast<double>(n));
    if (!(spread > 0.0)) return {};
    const double height =
        segment.dfSatHeight > 0.0 ? segment.dfSatHeight : segment.dfOrbitRadius - kEarthRadius;
    const double view = segment.dfViewAngle;
    const double scale =
        height / (std::cos(view) * std::cos(view) * std::cos(segment.dfPitchAngle));
    const double tilt = std::tan(view);
    std::vector<double> across(n), along(n), acrossColumn(n), alongColumn(n);
    for (std::size_t i = 0; i < n; ++i) {
        const double angle = segment.dfIFOV * (segment.dfCentreColumn - points[i].dfPixel);
        const double u = -angle * scale / (angle * tilt + 1.0);
        const double H = points[i].dfZ - u * u / (2.0 * kEarthRadius);
        across[i] = u;
        along[i] = points[i].dfLine;
        acrossColumn[i] = u * u / scale - H;
        alongColumn[i] = H;
    }
    const double rAcross = separation_detail::PlaneResidual(across, along, acrossColumn);
    const double rAlong = separation_detail::PlaneResidual(across, along, alongColumn);
    if (rAcross < 0.0 || rAlong < 0.0) return {};
    return {rAcross / spread, rAlong / spread};
}

}  // namespace lumo::cli
