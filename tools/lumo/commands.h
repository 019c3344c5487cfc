// The subcommands of the lumo tool. Each command file provides one Add...
// function; cli.cpp lists them in its command table, so a new model family
// adds its file and one line there.
#pragma once

#include <iosfwd>
#include <string>

#include "model_io.h"

namespace CLI {
class App;
}

namespace lumo::cli {

// Streams and result shared by the commands of one run.
struct CommandContext {
    std::ostream& out;
    std::ostream& err;
    int nExitCode = 0;
};

using AddCommandFn = void (*)(CLI::App& app, CommandContext& context);

void AddDemoCommand(CLI::App& app, CommandContext& context);
void AddTransformCommand(CLI::App& app, CommandContext& context);
void AddPolyCommand(CLI::App& app, CommandContext& context);

// Arguments of the point-transform commands (transform and the per-family
// commands): MODEL --to-image|--to-ground POINTS [-o OUT].
struct TransformOptions {
    std::string osModel;
    std::string osToImage;
    std::string osToGround;
    std::string osOutput;
};

// Adds the shared arguments to a command; exactly one direction is accepted.
void AddTransformArguments(CLI::App& command, TransformOptions& options);
// Fails with a usage error when neither direction was given.
void RequireDirection(const TransformOptions& options);
// Maps the chosen point file through `model` and writes the result.
void RunTransformOptions(const TransformOptions& options, const LoadedModel& model,
                         CommandContext& context);

}  // namespace lumo::cli
