// `lumo residuals MODEL --gcps FILE [-o OUT]`: per-point residuals of a model
// on control points in both directions, and their root mean squares.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <memory>
#include <ostream>
#include <sstream>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"
#include "points_io.h"

namespace lumo::cli {
namespace {

struct ResidualsOptions {
    std::string osModel;
    std::string osGcps;
    std::string osOutput;
};

// Model position minus control point position, both directions.
struct Residual {
    double dPixel = 0.0;
    double dLine = 0.0;
    double dX = 0.0;
    double dY = 0.0;
};

// Sums of squares and largest distances over the points.
struct Summary {
    std::size_t nCount = 0;
    double sumPixel2 = 0, sumLine2 = 0, sumX2 = 0, sumY2 = 0;
    double maxImage = 0, maxGround = 0;

    void Add(const Residual& r) {
        ++nCount;
        sumPixel2 += r.dPixel * r.dPixel;
        sumLine2 += r.dLine * r.dLine;
        sumX2 += r.dX * r.dX;
        sumY2 += r.dY * r.dY;
        maxImage = std::max(maxImage, std::hypot(r.dPixel, r.dLine));
        maxGround = std::max(maxGround, std::hypot(r.dX, r.dY));
    }
    double Rms(double sum) const { return nCount ? std::sqrt(sum / nCount) : 0.0; }
};

[[noreturn]] void FailPoint(const PointSet& gcps, const PointRecord& p, const std::string& what) {
    std::string name = gcps.osSource + ":" + std::to_string(p.nSourceLine);
    if (!p.osId.empty()) name += " (id " + Quoted(p.osId) + ")";
    LUMO_CLI_FAIL(name + ": " + what);
}

Residual ResidualOf(const LoadedModel& model, const PointSet& gcps, const PointRecord& p) {
    void* record = model.poRecord.get();
    double pixel = 0, line = 0, x = 0, y = 0;
    if (!GenGeo2Img(model.nModelCode, record, p.dfX, p.dfY, p.dfZ, &pixel, &line) ||
        !std::isfinite(pixel) || !std::isfinite(line)) {
        FailPoint(gcps, p, "the model cannot map this ground point to the image");
    }
    if (!GenImg2Geo(model.nModelCode, record, p.dfPixel, p.dfLine, p.dfZ, &x, &y) ||
        !std::isfinite(x) || !std::isfinite(y)) {
        FailPoint(gcps, p, "the model cannot map this image point to the ground");
    }
    return Residual{pixel - p.dfPixel, line - p.dfLine, x - p.dfX, y - p.dfY};
}

std::string Number(double value) {
    char text[32];
    std::snprintf(text, sizeof text, "%.6g", value);
    return text;
}

// The summary as comment lines, which the point reader skips.
std::string SummaryText(const Summary& s, const std::string& model) {
    const double rmsPixel = s.Rms(s.sumPixel2), rmsLine = s.Rms(s.sumLine2);
    const double rmsX = s.Rms(s.sumX2), rmsY = s.Rms(s.sumY2);
    return "# residuals of " + model + " on " + std::to_string(s.nCount) +
           " control points (model - control point)\n# rms dpixel " + Number(rmsPixel) +
           ", dline " + Number(rmsLine) + ", image " + Number(std::hypot(rmsPixel, rmsLine)) +
           ", max " + Number(s.maxImage) + " (pixels)\n# rms dx " + Number(rmsX) + ", dy " +
           Number(rmsY) + ", ground " + Number(std::hypot(rmsX, rmsY)) + ", max " +
           Number(s.maxGround) + " (ground units)\n";
}

void WriteTable(std::ostream& out, const PointSet& gcps, const std::vector<Residual>& residuals) {
    if (gcps.bHasId) out << "id,";
    out << "pixel,line,x,y," << (gcps.bHasZ ? "z," : "") << "dpixel,dline,dx,dy\n";
    for (std::size_t i = 0; i < residuals.size(); ++i) {
        const PointRecord& p = gcps.asPoints[i];
        const Residual& r = residuals[i];
        if (gcps.bHasId) out << p.osId << ',';
        out << FormatDouble(p.dfPixel) << ',' << FormatDouble(p.dfLine) << ','
            << FormatDouble(p.dfX) << ',' << FormatDouble(p.dfY) << ',';
        if (gcps.bHasZ) out << FormatDouble(p.dfZ) << ',';
        out << FormatDouble(r.dPixel) << ',' << FormatDouble(r.dLine) << ',' << FormatDouble(r.dX)
            << ',' << FormatDouble(r.dY) << '\n';
    }
}

void RunResiduals(const ResidualsOptions& options, CommandContext& context) {
    const LoadedModel model = ReadModelFile(options.osModel);
    const PointSet gcps = ReadPointsFile(options.osGcps, PointKind::ControlPoint);
    if (gcps.asPoints.empty()) LUMO_CLI_FAIL(options.osGcps + ": holds no control points");
    std::vector<Residual> residuals;
    Summary summary;
    for (const PointRecord& p : gcps.asPoints) {
        residuals.push_back(ResidualOf(model, gcps, p));
        summary.Add(residuals.back());
    }
    std::ostringstream text;
    WriteTable(text, gcps, residuals);
    const std::string summaryText = SummaryText(summary, options.osModel);
    text << summaryText;
    if (options.osOutput.empty()) {
        context.out << text.str();
        return;
    }
    WriteFileReplacing(options.osOutput, text.str());
    context.out << summaryText;
}

}  // namespace

void AddResidualsCommand(CLI::App& app, CommandContext& context) {
    auto options = std::make_shared<ResidualsOptions>();
    CLI::App* command = app.add_subcommand(
        "residuals", "Residuals of a model file on control points, both directions, with RMS");
    command->add_option("model", options->osModel, "model file (JSON)")->required();
    command->add_option("--gcps", options->osGcps, "control points (CSV with pixel,line,x,y)")
        ->required();
    command->add_option("-o,--output", options->osOutput,
                        "output CSV file (standard output when not given)");
    command->callback([options, &context] { RunResiduals(*options, context); });
}

}  // namespace lumo::cli
