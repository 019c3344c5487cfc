// `lumo poly MODEL --to-image|--to-ground POINTS [-o OUT]`: the point
// transform restricted to polynomial model files.
#include <memory>

#include <CLI/CLI.hpp>

#include "commands.h"

namespace lumo::cli {

void AddPolyCommand(CLI::App& app, CommandContext& context) {
    auto options = std::make_shared<TransformOptions>();
    CLI::App* command = app.add_subcommand("poly", "Map points through a polynomial model file");
    AddTransformArguments(*command, *options);
    command->callback([options, &context] {
        RequireDirection(*options);
        RunTransformOptions(*options, ReadModelFileOf(options->osModel, "poly"), context);
    });
}

}  // namespace lumo::cli
