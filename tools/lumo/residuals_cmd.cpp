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
#include "transform.h"

namespace lumo::cli {
namespace {

struct ResidualsOptions {
    std::string osModel;
    std::string osGcps;
    std::string osOutput;
    PointFileOptions sPoints;
    RigorousForm eForm = RigorousForm::Exact;
};

// Model position minus control point position, both directions; a direction
// that failed has no residual.
struct Residual {
    double dPixel = 0.0;
    double dLine = 0.0;
    double dX = 0.0;
    double dY = 0.0;
    bool bImage = false;
    bool bGround = false;
};

// Sums of squares and largest distances over the residuals computed.
struct Summary {
    std::size_t nImage = 0, nGround = 0, nFailed = 0;
    double sumPixel2 = 0, sumLine2 = 0, sumX2 = 0, sumY2 = 0;
    double maxImage = 0, maxGround = 0;

    void Add(const Residual& r) {
        if (r.bImage) {
            ++nImage;
            sumPixel2 += r.dPixel * r.dPixel;
            sumLine2 += r.dLine * r.dLine;
            maxImage = std::max(maxImage, std::hypot(r.dPixel, r.dLine));
        }
        if (r.bGround) {
            ++nGround;
            sumX2 += r.dX * r.dX;
            sumY2 += r.dY * r.dY;
            maxGround = std::max(maxGround, std::hypot(r.dX, r.dY));
        }
        if (!r.bImage || !r.bGround) ++nFailed;
    }
    static double Rms(double sum, std::size_t n) { return n ? std::sqrt(sum / n) : 0.0; }
};

// Residuals of one control point whose ground position in the model's system
// is `ground`; a direction the model cannot compute fails the point.
Residual ResidualOf(const LoadedModel& model, RigorousForm form, const GroundXY& ground,
                    PointRecord& p) {
    Residual r;
    if (p.Failed()) return r;  // the ground position could not be converted
    PointRecord image = p;
    image.dfX = ground.x;
    image.dfY = ground.y;
    TransformPoint(model, Direction::ToImage, image, form);
    PointRecord back = p;
    TransformPoint(model, Direction::ToGround, back);
    r.bImage = !image.Failed();
    r.bGround = !back.Failed();
    if (r.bImage) {
        r.dPixel = image.dfPixel - p.dfPixel;
        r.dLine = image.dfLine - p.dfLine;
    }
    if (r.bGround) {
        r.dX = back.dfX - ground.x;
        r.dY = back.dfY - ground.y;
    }
    if (!r.bImage || !r.bGround) {
        p.Fail(!r.bGround ? (!r.bImage ? kFailedBothWays : kFailedToGround) : kFailedToImage,
               r.bImage ? back.osProblem : image.osProblem);
    }
    return r;
}

std::string Number(double value) {
    char text[32];
    std::snprintf(text, sizeof text, "%.6g", value);
    return text;
}

// The summary as comment lines, which the point reader skips.
std::string SummaryText(const Summary& s, const std::string& model, std::size_t nPoints,
                        const std::string& groundUnits) {
    const double rmsPixel = s.Rms(s.sumPixel2, s.nImage), rmsLine = s.Rms(s.sumLine2, s.nImage);
    const double rmsX = s.Rms(s.sumX2, s.nGround), rmsY = s.Rms(s.sumY2, s.nGround);
    std::string text = "# residuals of " + model + " on " + std::to_string(nPoints) +
                       " control points (model - control point)\n";
    if (s.nFailed > 0) {
        text += "# " + std::to_string(s.nFailed) +
                " points failed in one or both directions (see the status column); the figures "
                "below leave them out\n";
    }
    return text + "# rms dpixel " + Number(rmsPixel) + ", dline " + Number(rmsLine) + ", image " +
           Number(std::hypot(rmsPixel, rmsLine)) + ", max " + Number(s.maxImage) +
           " (pixels)\n# rms dx " + Number(rmsX) + ", dy " + Number(rmsY) + ", ground " +
           Number(std::hypot(rmsX, rmsY)) + ", max " + Number(s.maxGround) + " (" + groundUnits +
           ")\n";
}

void WriteTable(std::ostream& out, const PointSet& gcps, const std::vector<Residual>& residuals) {
    out << GeorefComments(gcps);
    if (gcps.bHasId) out << "id,";
    out << "pixel,line,x,y," << (gcps.bHasZ ? "z," : "") << "dpixel,dline,dx,dy,status\n";
    const auto pair = [&out](bool bKnown, double a, double b) {
        if (bKnown)
            out << FormatDouble(a) << ',' << FormatDouble(b);
        else
            out << ',';
    };
    for (std::size_t i = 0; i < residuals.size(); ++i) {
        const PointRecord& p = gcps.asPoints[i];
        const Residual& r = residuals[i];
        if (gcps.bHasId) out << p.osId << ',';
        out << FormatDouble(p.dfPixel) << ',' << FormatDouble(p.dfLine) << ','
            << FormatDouble(p.dfX) << ',' << FormatDouble(p.dfY) << ',';
        if (gcps.bHasZ) out << FormatDouble(p.dfZ) << ',';
        pair(r.bImage, r.dPixel, r.dLine);
        out << ',';
        pair(r.bGround, r.dX, r.dY);
        out << ',' << p.osStatus << '\n';
    }
}

void RunResiduals(const ResidualsOptions& options, CommandContext& context) {
    const LoadedModel model = ReadModelFile(options.osModel);
    RequireRigorousForClosedForm(options.eForm, model);
    PointSet gcps = ReadPointsFile(options.osGcps, PointKind::ControlPoint);
    NoteDisabledPoints(gcps, "lumo residuals", context.err);
    if (gcps.asPoints.empty()) LUMO_CLI_FAIL(options.osGcps + ": holds no control points");
    ApplyHeights(gcps, options.sPoints, ModelUsesHeight(model.nModelCode), "the model");
    const Georef modelGeoref = ModelGeoref(model);
    const Georef declared = DeclaredGeoref(gcps, options.sPoints);
    const std::vector<GroundXY> ground =
        GroundInModelSystem(gcps, declared, modelGeoref, kFailedBothWays, context.err);
    DeclareGeoref(gcps, declared.Known() ? declared : modelGeoref);
    std::vector<Residual> residuals;
    Summary summary;
    for (std::size_t i = 0; i < gcps.asPoints.size(); ++i) {
        residuals.push_back(ResidualOf(model, options.eForm, ground[i], gcps.asPoints[i]));
        summary.Add(residuals.back());
    }
    std::ostringstream text;
    WriteTable(text, gcps, residuals);
    const std::string units =
        modelGeoref.Known() ? "ground units of " + Quoted(modelGeoref.osGeosys) : "ground units";
    const std::string summaryText =
        SummaryText(summary, options.osModel, gcps.asPoints.size(), units);
    text << summaryText;
    if (options.osOutput.empty()) {
        context.out << text.str();
    } else {
        WriteFileReplacing(options.osOutput, text.str());
        context.out << summaryText;
    }
    ReportFailedPoints(gcps, "residuals", options.sPoints.bKeepGoing, context);
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
    AddPointFileOptions(*command, options->sPoints);
    AddRigorousFormFlags(*command, options->eForm);
    command->callback([options, &context] { RunResiduals(*options, context); });
}

}  // namespace lumo::cli
