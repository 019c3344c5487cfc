// `lumo rpc IN OUT [--to txt|rpb|bin|json|tif]`: converts a rational
// function model between the RPC text forms, the binary block and a JSON
// model file, or attaches it to a GeoTIFF. The input form is recognised from
// the contents; the output form is given or taken from the output file's
// extension. `lumo rpc --fit MODEL OUT` fits rational polynomials to any
// model file first.
#include <cmath>
#include <memory>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"
#include "model_object.h"
#include "points_io.h"
#include "rf_forms.h"
#include "rpc_fit.h"

namespace lumo::cli {
namespace {

// Height range of a fit when none is given, metres above the ellipsoid.
constexpr double kDefaultMinHeight = 0.0;
constexpr double kDefaultMaxHeight = 2000.0;

struct RpcOptions {
    std::string osInput;
    std::string osOutput;
    std::string osTo;
    int nPixels = -1;  // -1: from the input when it is a model file, else 0
    int nLines = -1;
    bool bFit = false;
    std::vector<double> adfHeights;  // --heights MIN MAX
};

std::string Pixels(const RpcFitErrors& errors) {
    return "max " + FormatDouble(std::round(errors.dfMax * 1e5) / 1e5) + " / rms " +
           FormatDouble(std::round(errors.dfRms * 1e5) / 1e5) + " pixels over " +
           std::to_string(errors.nPoints) + " points";
}

// Rational polynomials fitted to the model file IN over its image and the
// height range, with the fit's errors reported.
RFModelInput FitInput(const RpcOptions& options, CommandContext& context) {
    const LoadedModel loaded = ReadModelFile(options.osInput);
    const std::unique_ptr<nova::mathmodel::IMathModel> object = MakeModelObject(loaded);
    const int nPixels = options.nPixels >= 0 ? options.nPixels : loaded.sEnvelope.nPixels;
    const int nLines = options.nLines >= 0 ? options.nLines : loaded.sEnvelope.nLines;
    const bool bHeights = options.adfHeights.size() == 2;
    const double dfMin = bHeights ? options.adfHeights[0] : kDefaultMinHeight;
    const double dfMax = bHeights ? options.adfHeights[1] : kDefaultMaxHeight;
    RpcFit fit = FitRpcToModel(*object, nPixels, nLines, dfMin, dfMax);
    context.out << "fitted rational polynomials to " << options.osInput << " ("
                << loaded.sEnvelope.osFamily << "), " << nPixels << " x " << nLines
                << " pixels, heights " << FormatDouble(dfMin) << " to " << FormatDouble(dfMax)
                << " m above the ellipsoid\nfit grid: " << Pixels(fit.sFit)
                << "\nindependent check grid: " << Pixels(fit.sCheck) << "\n";
    RFModelInput model;
    model.psRF = fit.psRF.get();
    model.poOwner = ShareRFRecord(std::move(fit.psRF));
    model.nPixels = nPixels;
    model.nLines = nLines;
    return model;
}

void RunRpc(const RpcOptions& options, CommandContext& context) {
    if (!options.bFit && !options.adfHeights.empty()) {
        throw CLI::ValidationError("--heights applies to --fit only");
    }
    const std::string form = RFOutputForm(options.osTo, options.osOutput);
    const RFModelInput model =
        options.bFit ? FitInput(options, context) : ReadRFModelAnyForm(options.osInput);
    const int nPixels = options.nPixels >= 0 ? options.nPixels : model.nPixels;
    const int nLines = options.nLines >= 0 ? options.nLines : model.nLines;
    WriteRFModel(model.psRF, form, options.osOutput, nPixels, nLines, model.aoFields);
    NoteDroppedRPCFields(model.aoFields, form, options.osOutput, "lumo rpc", context.err);
    context.out << options.osInput << " -> " << options.osOutput << " ("
                << (form == "tif" ? std::string("RPC metadata") : form) << ")\n";
}

}  // namespace

void AddRpcCommand(CLI::App& app, CommandContext& context) {
    auto options = std::make_shared<RpcOptions>();
    CLI::App* command = app.add_subcommand(
        "rpc",
        "Convert a rational function model between RPC text, binary block, JSON and GeoTIFF "
        "metadata, or fit one to any model (--fit)");
    command
        ->add_option("IN", options->osInput,
                     "model: RPC text (_RPC.TXT or .RPB), block, JSON; with --fit any model file")
        ->required();
    command->add_option("OUT", options->osOutput, "file to write, or a GeoTIFF to attach to")
        ->required();
    command->add_option("--to", options->osTo, "output form: txt, rpb, bin, json or tif");
    command->add_flag("--fit", options->bFit,
                      "fit terrain-independent rational polynomials to the model file IN");
    command
        ->add_option("--heights", options->adfHeights,
                     "height range of the fit: MIN MAX, metres above the ellipsoid (default 0 "
                     "2000)")
        ->expected(2);
    command
        ->add_option("--pixels", options->nPixels,
                     "image width for a JSON model file (--fit: default the model's)")
        ->check(CLI::NonNegativeNumber);
    command
        ->add_option("--lines", options->nLines,
                     "image height for a JSON model file (--fit: default the model's)")
        ->check(CLI::NonNegativeNumber);
    command->callback([options, &context] { RunRpc(*options, context); });
}

}  // namespace lumo::cli
