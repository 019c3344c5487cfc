#include "gdal_commands.h"

#include <CLI/CLI.hpp>

#include "lumo_gdal.h"

namespace lumo::cli {

void AddElevationOptions(CLI::App& command, std::string& dem, std::string& heights) {
    command.add_option("--dem", dem,
                       "elevation: a raster GDAL reads, or \"geoid\" for mean sea level "
                       "(default)");
    command
        .add_option("--dem-heights", heights,
                    "what the elevation file's heights are measured from: file (its vertical "
                    "CRS; mean sea level when it has none), msl or ellipsoid")
        ->check(CLI::IsMember({"file", "msl", "ellipsoid"}));
}

nova::dem::DEMPtr OpenElevation(const std::string& dem, const std::string& heights) {
    lumo::gdal::Initialize();
    if (dem == "geoid" || dem == "egm96") {
        return nova::dem::DEMPtr(nova::dem::DEMFactory::CreateDEM(dem, 16));
    }
    lumo::gdal::FileDEMOptions options;
    options.eHeights = heights == "msl"         ? lumo::gdal::HeightReference::kMeanSeaLevel
                       : heights == "ellipsoid" ? lumo::gdal::HeightReference::kEllipsoid
                                                : lumo::gdal::HeightReference::kFromFile;
    return nova::dem::DEMPtr(lumo::gdal::OpenFileDEM(dem, options));
}

}  // namespace lumo::cli
