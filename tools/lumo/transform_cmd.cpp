// `lumo transform MODEL --to-image|--to-ground POINTS [-o OUT]` for any model
// family the model-file reader knows.
#include <cstdint>
#include <memory>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"
#include "transform.h"

namespace lumo::cli {

void AddTransformArguments(CLI::App& command, TransformOptions& options) {
    command.add_option("model", options.osModel, "model file (JSON)")->required();
    auto* toImage = command.add_option("--to-image", options.osToImage,
                                       "ground points (CSV with x,y[,z]) to map to the image");
    auto* toGround = command.add_option("--to-ground", options.osToGround,
                                        "image points (CSV with pixel,line[,z]) to map to ground");
    toImage->excludes(toGround);
    command.add_option("-o,--output", options.osOutput,
                       "output CSV file (standard output when not given)");
    AddPointFileOptions(command, options.sPoints);
}

void AddRigorousFormFlags(CLI::App& command, RigorousForm& form) {
    auto* closed = command.add_flag_function(
        "--closed-form", [&form](std::int64_t) { form = RigorousForm::ClosedForm; },
        "rigorous models, --to-image: the closed-form equations instead of the exact inverse of "
        "the image-to-ground equations (off nadir they differ by tenths of a pixel)");
    // The exact inverse was an option before it became the default.
    command.add_flag("--exact", "rigorous models: the exact inverse (the default)")
        ->excludes(closed);
}

void RequireRigorousForClosedForm(RigorousForm form, const LoadedModel& model) {
    if (form == RigorousForm::ClosedForm && model.nModelCode != LUMO_CODE_SRIT) {
        LUMO_CLI_FAIL(model.sEnvelope.osSource +
                      ": --closed-form needs a rigorous (srit) model, found " +
                      Quoted(model.sEnvelope.osFamily));
    }
}

void RunTransformOptions(const TransformOptions& options, const LoadedModel& model,
                         CommandContext& context) {
    RunTransform(options, model, context);
}

// The direction is checked before the model is read so that a usage error
// is reported as such.
void RequireDirection(const TransformOptions& options) {
    if (options.osToImage.empty() && options.osToGround.empty()) {
        throw CLI::ValidationError("one of --to-image POINTS or --to-ground POINTS is required");
    }
}

void AddTransformCommand(CLI::App& app, CommandContext& context) {
    auto options = std::make_shared<TransformOptions>();
    CLI::App* command =
        app.add_subcommand("transform", "Map points through a model file of any known family");
    AddTransformArguments(*command, *options);
    AddRigorousFormFlags(*command, options->eForm);
    command->callback([options, &context] {
        RequireDirection(*options);
        if (options->eForm == RigorousForm::ClosedForm && options->osToImage.empty()) {
            throw CLI::ValidationError("--closed-form applies to --to-image only");
        }
        const LoadedModel model = ReadModelFile(options->osModel);
        RequireRigorousForClosedForm(options->eForm, model);
        RunTransformOptions(*options, model, context);
    });
}

}  // namespace lumo::cli
