#include "fit_refine.h"

#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <ostream>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "progress.h"
#include "tool_warnings.h"

namespace lumo::cli {
namespace {

std::size_t CountUsed(const std::vector<char>& use) {
    std::size_t n = 0;
    for (const char u : use) n += u ? 1 : 0;
    return n;
}

// Fits to `use` and stores measured minus predicted for every point.
bool Residuals(const ImageFit& fit, const PointSet& gcps, const std::vector<char>& use,
               std::vector<double>& dPixel, std::vector<double>& dLine) {
    std::vector<double> pixel, line;
    const bool ok = fit(use, pixel, line);
    if (!ok) return false;
    const std::size_t n = gcps.asPoints.size();
    dPixel.resize(n);
    dLine.resize(n);
    for (std::size_t i = 0; i < n; ++i) {
        dPixel[i] = gcps.asPoints[i].dfPixel - pixel[i];
        dLine[i] = gcps.asPoints[i].dfLine - line[i];
    }
    return true;
}

// Leave-one-out residuals of the points in use; false where the fit without
// a point fails.
void LeaveOneOut(const ImageFit& fit, const PointSet& gcps, std::vector<char> use,
                 std::vector<PointResidual>& points) {
    std::vector<double> dPixel, dLine;
    for (std::size_t i = 0; i < use.size(); ++i) {
        if (!use[i]) continue;
        use[i] = 0;
        points[i].bLoo = Residuals(fit, gcps, use, dPixel, dLine);
        if (points[i].bLoo) {
            points[i].dfLooPixel = dPixel[i];
            points[i].dfLooLine = dLine[i];
        }
        use[i] = 1;
    }
}

// The point in use with the largest leave-one-out distance; npos when none
// has one.
std::size_t WorstPoint(const std::vector<PointResidual>& points, const std::vector<char>& use) {
    std::size_t worst = std::string::npos;
    double largest = -1.0;
    for (std::size_t i = 0; i < points.size(); ++i) {
        if (!use[i] || !points[i].bLoo) continue;
        const double d = std::hypot(points[i].dfLooPixel, points[i].dfLooLine);
        if (d > largest) {
            largest = d;
            worst = i;
        }
    }
    return worst;
}

std::string Fixed(double value, int width) {
    char text[40];
    std::snprintf(text, sizeof text, "%*.3f", width, value);
    return text;
}

std::string Label(const PointSet& gcps, std::size_t i) {
    const PointRecord& p = gcps.asPoints[i];
    return p.osId.empty() ? "line " + std::to_string(p.nSourceLine) : p.osId;
}

}  // namespace

RefineOptions ParseRefine(const std::string& text) {
    RefineOptions options;
    options.bEnabled = true;
    const std::size_t comma = text.find(',');
    const std::string tolerance = text.substr(0, comma);
    char* end = nullptr;
    options.dfTolerance = std::strtod(tolerance.c_str(), &end);
    if (tolerance.empty() || *end != '\0' || !std::isfinite(options.dfTolerance) ||
        options.dfTolerance <= 0.0) {
        throw CLI::ValidationError("--refine " + Quoted(text) +
                                   ": TOLERANCE must be a positive number of pixels");
    }
    if (comma == std::string::npos) return options;
    const std::string minimum = text.substr(comma + 1);
    const long value = std::strtol(minimum.c_str(), &end, 10);
    if (minimum.empty() || *end != '\0' || value < 1 || value > 1000000) {
        throw CLI::ValidationError("--refine " + Quoted(text) +
                                   ": MIN_POINTS must be a whole number of points from 1");
    }
    options.nMinPoints = static_cast<int>(value);
    return options;
}

FitResiduals RefineAndMeasure(const ImageFit& fit, const PointSet& gcps, int nLeast,
                              const RefineOptions& options, const std::string& command) {
    const std::size_t n = gcps.asPoints.size();
    if (options.bEnabled && options.nMinPoints > 0 && options.nMinPoints < nLeast) {
        LUMO_CLI_FAIL("--refine: MIN_POINTS " + std::to_string(options.nMinPoints) +
                      " is below the " + std::to_string(nLeast) + " points the fit needs");
    }
    // Without a point to spare no leave-one-out fit exists, so the default
    // minimum keeps one.
    const std::size_t nMin =
        static_cast<std::size_t>(options.nMinPoints > 0 ? options.nMinPoints : nLeast + 1);
    // One refit per point and per refinement round: the longest step of a
    // fit. The refits' warnings speak of subsets of the points; the caller's
    // final fit reports on the model itself.
    const Activity activity(command + ": leave-one-out residuals of " + std::to_string(n) +
                            " control points");
    const WarningCapture subsetWarnings;
    FitResiduals result;
    result.use.assign(n, 1);
    for (;;) {
        result.asPoints.assign(n, PointResidual{});
        LeaveOneOut(fit, gcps, result.use, result.asPoints);
        if (!options.bEnabled || CountUsed(result.use) <= nMin) break;
        const std::size_t worst = WorstPoint(result.asPoints, result.use);
        if (worst == std::string::npos ||
            std::hypot(result.asPoints[worst].dfLooPixel, result.asPoints[worst].dfLooLine) <=
                options.dfTolerance) {
            break;
        }
        result.use[worst] = 0;
        result.anDropped.push_back(worst);
    }
    std::vector<double> dPixel, dLine;
    result.bFitted = Residuals(fit, gcps, result.use, dPixel, dLine);
    if (!result.bFitted) return result;
    for (std::size_t i = 0; i < n; ++i) {
        PointResidual& r = result.asPoints[i];
        r.dfPixel = dPixel[i];
        r.dfLine = dLine[i];
        if (!result.use[i]) {  // left out of the final fit: its residual is a left-out one
            r.bDropped = true;
            r.bLoo = true;
            r.dfLooPixel = dPixel[i];
            r.dfLooLine = dLine[i];
        }
    }
    return result;
}

void PrintPointResiduals(std::ostream& out, const PointSet& gcps, const FitResiduals& residuals) {
    if (!residuals.bFitted) return;
    out << "control point residuals, measured minus fitted (pixels; loo: with the point left "
           "out of the fit):\n"
        << "point              dpixel     dline  loo-dpixel  loo-dline\n";
    double sum = 0.0, sumLoo = 0.0;
    std::size_t nUsed = 0, nLoo = 0;
    for (std::size_t i = 0; i < residuals.asPoints.size(); ++i) {
        const PointResidual& r = residuals.asPoints[i];
        std::string label = Label(gcps, i);
        if (label.size() < 12) label.resize(12, ' ');
        out << label << Fixed(r.dfPixel, 12) << Fixed(r.dfLine, 10);
        if (r.bLoo) {
            out << Fixed(r.dfLooPixel, 12) << Fixed(r.dfLooLine, 11);
        } else {
            out << "           -          -";
        }
        out << (r.bDropped ? "  dropped" : "") << "\n";
        if (r.bDropped) continue;
        ++nUsed;
        sum += r.dfPixel * r.dfPixel + r.dfLine * r.dfLine;
        if (r.bLoo) {
            ++nLoo;
            sumLoo += r.dfLooPixel * r.dfLooPixel + r.dfLooLine * r.dfLooLine;
        }
    }
    out << "rms distance of the " << nUsed
        << " points of the fit: " << Fixed(std::sqrt(sum / static_cast<double>(nUsed)), 0);
    if (nLoo > 0) {
        out << ", left out: " << Fixed(std::sqrt(sumLoo / static_cast<double>(nLoo)), 0);
    }
    out << "\n";
    if (residuals.anDropped.empty()) return;
    out << "dropped by --refine, in order:";
    for (const std::size_t i : residuals.anDropped) {
        const PointResidual& r = residuals.asPoints[i];
        out << " " << Label(gcps, i) << " (" << Fixed(std::hypot(r.dfPixel, r.dfLine), 0) << " px)";
    }
    out << "\n";
}

ControlArrays ToArrays(const PointSet& gcps) {
    ControlArrays c;
    for (const PointRecord& p : gcps.asPoints) {
        c.pixel.push_back(p.dfPixel);
        c.line.push_back(p.dfLine);
        c.x.push_back(p.dfX);
        c.y.push_back(p.dfY);
        c.z.push_back(p.dfZ);
    }
    return c;
}

ControlArrays Subset(const ControlArrays& c, const std::vector<char>& use) {
    ControlArrays kept;
    for (std::size_t i = 0; i < c.pixel.size(); ++i) {
        if (!use[i]) continue;
        kept.pixel.push_back(c.pixel[i]);
        kept.line.push_back(c.line[i]);
        kept.x.push_back(c.x[i]);
        kept.y.push_back(c.y[i]);
        kept.z.push_back(c.z[i]);
    }
    return kept;
}

PointSet KeptPoints(const PointSet& gcps, const FitResiduals& residuals) {
    PointSet kept = gcps;
    kept.asPoints.clear();
    for (std::size_t i = 0; i < gcps.asPoints.size(); ++i) {
        if (residuals.use[i]) kept.asPoints.push_back(gcps.asPoints[i]);
    }
    return kept;
}

}  // namespace lumo::cli
