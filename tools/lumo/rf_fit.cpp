// `lumo fit --model rf --rpc FILE --gcps FILE [--adjust shift|affine|second]`:
// refines a delivered rational function model by an image-space adjustment
// fitted to control points, reports the control points' residuals before
// and after, and writes the adjusted model in the form the output names.
#include <algorithm>
#include <cmath>
#include <ostream>
#include <string>
#include <vector>

#include "cli_error.h"
#include "commands.h"
#include "fit_refine.h"
#include "geosys_option.h"
#include "json_fields.h"
#include "rf_forms.h"

namespace lumo::cli {
namespace {

int AdjustKind(const std::string& adjust) {
    if (adjust == "shift") return RF_ADJUST_SHIFT;
    if (adjust == "second") return RF_ADJUST_SECOND;
    return RF_ADJUST_AFFINE;
}

// The control points with their ground coordinates in the model's
// georeferencing.
ControlArrays ControlInModelSystem(PointSet& gcps, const PointFileOptions& points,
                                   const RFInfo_t& rf, CommandContext& context) {
    Georef model;
    model.osGeosys = BufferText(rf.pszGeosys, RF_TEXT_SIZE - 1);
    model.sProj = *rf.psProjInfo;
    const Georef declared = DeclaredGeoref(gcps, points);
    if (declared.Known()) WarnOutsideUTMBand(declared.sProj, gcps, "lumo fit", context.err);
    const std::vector<GroundXY> ground =
        GroundInModelSystem(gcps, declared, model, kFailedToImage, context.err);
    ControlArrays c = ToArrays(gcps);
    for (std::size_t i = 0; i < ground.size(); ++i) {
        const PointRecord& p = gcps.asPoints[i];
        if (p.Failed()) LUMO_CLI_FAIL(PointName(gcps, p) + ": " + p.osProblem);
        c.x[i] = ground[i].x;
        c.y[i] = ground[i].y;
    }
    return c;
}

// Residual summary of the model on the control points, in pixels.
std::string ResidualSummary(RFInfo_t* psRF, const ControlArrays& c) {
    double sumPixel = 0.0, sumLine = 0.0, worst = 0.0;
    for (int i = 0; i < c.Count(); ++i) {
        double p = 0.0, l = 0.0;
        RFGeo2Img(psRF, c.x[i], c.y[i], c.z[i], &p, &l);
        const double dp = c.pixel[i] - p, dl = c.line[i] - l;
        sumPixel += dp * dp;
        sumLine += dl * dl;
        worst = std::max(worst, std::hypot(dp, dl));
    }
    const double n = c.Count();
    return "rms pixel " + FormatShort(std::sqrt(sumPixel / n)) + ", line " +
           FormatShort(std::sqrt(sumLine / n)) + ", total " +
           FormatShort(std::sqrt((sumPixel + sumLine) / n)) + ", largest " + FormatShort(worst);
}

// The adjustment of `psRF` fitted to some of the points; the record keeps
// the last successful fit.
ImageFit RFImageFit(RFInfo_t* psRF, int nKind, const ControlArrays& c) {
    return [psRF, nKind, &c](const std::vector<char>& use, std::vector<double>& pixel,
                             std::vector<double>& line) {
        ControlArrays k = Subset(c, use);
        if (!RFComputeAdjustment(psRF, nKind, k.Count(), k.x.data(), k.y.data(), k.z.data(),
                                 k.pixel.data(), k.line.data())) {
            return false;
        }
        pixel.resize(c.x.size());
        line.resize(c.x.size());
        for (int i = 0; i < c.Count(); ++i) {
            RFGeo2Img(psRF, c.x[i], c.y[i], c.z[i], &pixel[i], &line[i]);
        }
        return true;
    };
}

}  // namespace

void RunRFFit(PointSet& gcps, const RFFitOptions& options, CommandContext& context) {
    if (options.osRpc.empty()) LUMO_CLI_FAIL("--model rf needs --rpc FILE, the model to refine");
    // The output form first, so that a bad name fails before any work.
    const std::string form = RFOutputForm("", options.osOutput);
    RFModelInput model = ReadRFModelAnyForm(options.osRpc);
    const ControlArrays c = ControlInModelSystem(gcps, options.sPoints, *model.psRF, context);
    const int nKind = AdjustKind(options.osAdjust);
    if (c.Count() < nKind) {
        LUMO_CLI_FAIL(gcps.osSource + ": --adjust " + options.osAdjust + " has " +
                      std::to_string(2 * nKind) + " terms and needs at least " +
                      std::to_string(nKind) + " control points, found " +
                      std::to_string(c.Count()));
    }
    const std::string before = ResidualSummary(model.psRF, c);
    RFInfo_t* psRF = model.psRF;
    if (!RFComputeAdjustment(psRF, nKind, c.Count(), c.x.data(), c.y.data(), c.z.data(),
                             c.pixel.data(), c.line.data())) {
        LUMO_CLI_FAIL(gcps.osSource + ": the " + std::to_string(c.Count()) +
                      " control points lie on one line in the image and cannot determine the "
                      "--adjust " +
                      options.osAdjust + " terms; use --adjust shift");
    }
    const FitResiduals residuals =
        RefineAndMeasure(RFImageFit(psRF, nKind, c), gcps, nKind, options.sRefine);
    // The adjustment of the points kept, whatever fit ran last.
    ControlArrays kept = Subset(c, residuals.use);
    if (!RFComputeAdjustment(psRF, nKind, kept.Count(), kept.x.data(), kept.y.data(), kept.z.data(),
                             kept.pixel.data(), kept.line.data())) {
        LUMO_CLI_FAIL(gcps.osSource + ": the " + std::to_string(kept.Count()) +
                      " control points left by --refine cannot determine the --adjust " +
                      options.osAdjust + " terms; give a larger MIN_POINTS");
    }
    const int nPixels = options.nPixels >= 0 ? options.nPixels : model.nPixels;
    const int nLines = options.nLines >= 0 ? options.nLines : model.nLines;
    WriteRFModel(psRF, form, options.osOutput, nPixels, nLines, model.aoFields);
    NoteDroppedRPCFields(model.aoFields, form, options.osOutput, "lumo fit", context.err);
    context.out << "fitted rf adjustment " << options.osAdjust << " to " << kept.Count()
                << " control points\nresiduals before (all " << c.Count() << " points): " << before
                << "\nresiduals after (the " << kept.Count()
                << " points of the fit): " << ResidualSummary(psRF, kept) << "\n";
    PrintPointResiduals(context.out, gcps, residuals);
    context.out << "wrote " << options.osOutput << " (" << form << ")\n";
}

}  // namespace lumo::cli
