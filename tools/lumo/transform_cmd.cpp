// `lumo transform MODEL --to-image|--to-ground POINTS [-o OUT]` for any model
// family the model-file reader knows.
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
    command->add_flag("--exact", options->bExact,
                      "rigorous models, --to-image: invert the image-to-ground equations exactly");
    command->callback([options, &context] {
        RequireDirection(*options);
        if (options->bExact && options->osToImage.empty()) {
            throw CLI::ValidationError("--exact applies to --to-image only");
        }
        const LoadedModel model = ReadModelFile(options->osModel);
        if (options->bExact && model.nModelCode != LUMO_CODE_SRIT) {
            LUMO_CLI_FAIL(options->osModel + ": --exact needs a rigorous (srit) model, found " +
                          Quoted(model.sEnvelope.osFamily));
        }
        RunTransformOptions(*options, model, context);
    });
}

}  // namespace lumo::cli
