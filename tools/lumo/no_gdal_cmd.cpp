// Without the GDAL component the commands that read rasters exist but say
// why they cannot run.
#ifndef LUMO_HAVE_GDAL

#include <string>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"

namespace lumo::cli {
namespace {

void AddUnavailable(CLI::App& app, const char* pszName, const char* pszDescription) {
    CLI::App* command = app.add_subcommand(pszName, pszDescription);
    command->allow_extras();
    const std::string name = pszName;
    command->callback([name] {
        LUMO_CLI_FAIL("lumo " + name +
                      " needs the GDAL component: rebuild with GDAL (Debian: libgdal-dev)");
    });
}

}  // namespace

void AddInfoCommand(CLI::App& app, CommandContext&) {
    AddUnavailable(app, "info", "Show an image's metadata (needs GDAL)");
}

void AddOrthoCommand(CLI::App& app, CommandContext&) {
    AddUnavailable(app, "ortho", "Orthorectify an image (needs GDAL)");
}

}  // namespace lumo::cli

#endif
