// `lumo demo`'s orthoimage row: a simulated push-broom image over the bundled
// elevation file, orthorectified with its rigorous model; the marks on the
// ground are measured in the orthoimage, and a PNG quick-look is written.
#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <ostream>
#include <string>

#include <cpl_error.h>
#include <gdal_utils.h>

#include "cli_error.h"
#include "gdal_commands.h"
#include "lumo.h"
#include "lumo_gdal.h"
#include "marked_scene.h"

namespace lumo::cli {
namespace {

namespace fs = std::filesystem;

constexpr const char* kDemFile = "demo_dem.tif";
constexpr const char* kOrthoFile = "lumo_demo_ortho.tif";
constexpr const char* kQuickLookFile = "lumo_demo_ortho.png";
// The scene: 256 x 256 pixels of 5 m, 15 degrees off nadir, looking at the
// centre of the elevation file.
constexpr int kImageSize = 256;
constexpr double kRollDeg = 15.0;
constexpr double kCentreLat = 45.0;
constexpr double kCentreLon = 3.0;

// Removes the scratch directory of the simulated image on every path.
struct ScratchDir {
    fs::path oPath;
    ~ScratchDir() {
        std::error_code error;
        fs::remove_all(oPath, error);
    }
};

void WriteQuickLook(const std::string& ortho, const std::string& png) {
    // Bytes stretched over the hill shading (the marks saturate); no nodata,
    // which a PNG cannot carry.
    const char* apszArgs[] = {"-of", "PNG", "-ot", "Byte",      "-scale", "60",
                              "190", "0",   "255", "-a_nodata", "none",   nullptr};
    GDALTranslateOptions* psOptions =
        GDALTranslateOptionsNew(const_cast<char**>(apszArgs), nullptr);
    CPLPushErrorHandler(CPLQuietErrorHandler);
    GDALDatasetH hSource = GDALOpen(ortho.c_str(), GA_ReadOnly);
    GDALDatasetH hPng =
        hSource != nullptr ? GDALTranslate(png.c_str(), hSource, psOptions, nullptr) : nullptr;
    GDALTranslateOptionsFree(psOptions);
    if (hPng != nullptr) GDALClose(hPng);
    if (hSource != nullptr) GDALClose(hSource);
    CPLPopErrorHandler();
    std::error_code error;
    fs::remove(png + ".aux.xml", error);
    if (hPng == nullptr) LUMO_CLI_FAIL(png + ": cannot write the quick-look");
}

}  // namespace

void PrintOrthoDemo(const std::string& examplesDir, const std::string& outputDir,
                    std::ostream& out) {
    lumo::gdal::Initialize();
    const std::string demPath = (fs::path(examplesDir) / kDemFile).string();
    const nova::dem::DEMPtr dem(lumo::gdal::OpenFileDEM(demPath, lumo::gdal::FileDEMOptions{}));
    lumo::sim::SceneParams base;
    base.nPixels = base.nLines = kImageSize;
    base.nUtmZone = 31;
    const lumo::sim::SceneParams params =
        lumo::sim::AimAt(base, kCentreLat, kCentreLon, kRollDeg, 0.0);

    ScratchDir scratch{fs::temp_directory_path() / ("lumo_demo_" + std::to_string(::getpid()))};
    fs::create_directories(scratch.oPath);
    const std::string image = (scratch.oPath / "scene.tif").string();
    const MarkedScene scene = MakeMarkedScene(params, *dem, 4, 20, image);
    const nova::mathmodel::LumoMathModel model(LUMO_CODE_SRIT, scene.psModel.get());
    const std::string ortho = (fs::path(outputDir) / kOrthoFile).string();
    const std::string png = (fs::path(outputDir) / kQuickLookFile).string();
    const lumo::gdal::OrthoGrid grid =
        lumo::gdal::Orthorectify(image, model, *dem, ortho, lumo::gdal::OrthoOptions{});
    const MarkStats marks = MeasureMarks(ortho, scene);
    WriteQuickLook(ortho, png);

    char line[256];
    std::snprintf(line, sizeof line,
                  "\northoimage: simulated %dx%d push-broom image, %.0f deg off nadir, over %s\n"
                  "  rigorous model from 20 exact control points; %d of %d ground marks found,\n"
                  "  mark position error max %.3g / rms %.3g output pixels\n",
                  kImageSize, kImageSize, kRollDeg, kDemFile, marks.nFound, marks.nMarks,
                  marks.dfMax, marks.dfRms);
    out << line << "  wrote " << ortho << " (" << grid.nPixels << " x " << grid.nLines
        << " pixels of " << grid.adfGeoTransform[1] << " m) and quick-look " << png << "\n";
}

}  // namespace lumo::cli
