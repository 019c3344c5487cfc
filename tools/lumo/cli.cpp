#include "cli.h"

#include <array>
#include <iostream>

#include <CLI/CLI.hpp>

#include "commands.h"
#include "lumo.h"
#include "nova/runtime.h"
#include "tool_warnings.h"

namespace lumo::cli {
namespace {

#ifndef LUMO_VERSION_STRING
#define LUMO_VERSION_STRING "unknown"
#endif

// Every subcommand; a new family adds its Add...Command here.
// (A plain array, so that adding a line needs no count.)
constexpr AddCommandFn kCommands[] = {
    &AddDemoCommand,     &AddTransformCommand, &AddPolyCommand,          &AddRpcCommand,
    &AddFitCommand,      &AddResidualsCommand, &AddGcpsCommand,          &AddSegmentCommand,
    &AddSimulateCommand, &AddBlockCommand,     &AddSimulateAvhrrCommand, &AddAnglesCommand,
    &AddInfoCommand,     &AddOrthoCommand,
};

std::string VersionText() {
    std::string text = std::string("lumo ") + LUMO_VERSION_STRING;
    // The library is loaded separately; say so when it differs from the tool.
    const char* library = LumoVersion();
    if (library != nullptr && std::string(library) != LUMO_VERSION_STRING) {
        text += std::string(" (library ") + library + ")";
    }
    return text;
}

}  // namespace

int RunLumo(int argc, char** argv, std::ostream& out, std::ostream& err) {
    CommandContext context{out, err};
    const ToolWarnings warnings(err);
    CLI::App app("Geometric math models for remote-sensing imagery", "lumo");
    app.require_subcommand(0, 1);
    bool showVersion = false;
    app.add_flag("--version", showVersion, "print the version and exit");
    for (AddCommandFn add : kCommands) add(app, context);
    try {
        app.parse(argc, argv);
        if (showVersion) {
            out << VersionText() << '\n';
            return 0;
        }
        if (app.get_subcommands().empty()) {
            err << app.help();
            return kExitUsage;
        }
    } catch (const CLI::ParseError& e) {
        // Help is a success; every other parse or validation error is a usage error.
        return app.exit(e, out, err) == 0 ? kExitSuccess : kExitUsage;
    } catch (const nova::Exception& e) {
        err << "lumo: " << e.what() << '\n';
        return kExitFailed;
    } catch (const std::exception& e) {
        err << "lumo: " << e.what() << '\n';
        return kExitFailed;
    }
    return context.nExitCode;
}

int RunLumo(int argc, char** argv) {
    return RunLumo(argc, argv, std::cout, std::cerr);
}

}  // namespace lumo::cli
