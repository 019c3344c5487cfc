// Shared pieces of the commands that read rasters through the GDAL
// component.
#pragma once

#include <iosfwd>
#include <string>

#include "nova/dem.h"

namespace CLI {
class App;
}

namespace lumo::cli {

// --dem FILE|geoid and --dem-heights file|msl|ellipsoid.
void AddElevationOptions(CLI::App& command, std::string& dem, std::string& heights);

// The elevation model named by --dem: "geoid" (or "egm96") for mean sea
// level, else an elevation file whose heights are measured as --dem-heights
// says ("file": as the file declares, mean sea level when it does not).
nova::dem::DEMPtr OpenElevation(const std::string& dem, const std::string& heights);

// `lumo demo`'s orthoimage row; writes the orthoimage and its PNG quick-look
// into outputDir.
void PrintOrthoDemo(const std::string& examplesDir, const std::string& outputDir,
                    std::ostream& out);

}  // namespace lumo::cli
