// `lumo ortho IMAGE OUT [--model MODEL] [--dem FILE|geoid] ...`: an
// orthoimage of every band of IMAGE through a model file or the image's own
// rational polynomials, over an elevation file or the geoid, as a tiled,
// compressed GeoTIFF.
#include <atomic>
#include <chrono>
#include <csignal>
#include <memory>
#include <mutex>
#include <ostream>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"
#include "gdal_commands.h"
#include "lumo_gdal.h"
#include "model_object.h"
#include "points_io.h"
#include "progress.h"
#include "rf_io.h"

namespace lumo::cli {
namespace {

struct OrthoCommandOptions {
    std::string osImage;
    std::string osOutput;
    std::string osModel;
    std::string osDem = "geoid";
    std::string osDemHeights = "file";
    std::string osResampling = "bilinear";
    std::vector<double> adfExtent;
    double dfNoData = 0.0;
    CLI::Option* poNoData = nullptr;
    lumo::gdal::OrthoOptions sOrtho;
};

// Ctrl-C cancels the run cleanly: the warp stops at its next progress report
// and the partial file is removed.
std::atomic<bool> gbInterrupted{false};

extern "C" void OnInterrupt(int) {
    gbInterrupted = true;
}

class InterruptGuard {
  public:
    InterruptGuard() : mpfnPrevious(std::signal(SIGINT, OnInterrupt)) { gbInterrupted = false; }
    ~InterruptGuard() { std::signal(SIGINT, mpfnPrevious); }
    InterruptGuard(const InterruptGuard&) = delete;
    InterruptGuard& operator=(const InterruptGuard&) = delete;

  private:
    void (*mpfnPrevious)(int);
};

lumo::gdal::Resampling ParseResampling(const std::string& text) {
    if (text == "nearest") return lumo::gdal::Resampling::kNearest;
    if (text == "cubic") return lumo::gdal::Resampling::kCubic;
    if (text == "lanczos") return lumo::gdal::Resampling::kLanczos;
    return lumo::gdal::Resampling::kBilinear;
}

std::unique_ptr<nova::mathmodel::IMathModel> OpenModel(const OrthoCommandOptions& options,
                                                       const lumo::gdal::ImageInfo& image) {
    if (!options.osModel.empty()) return MakeModelObject(ReadModelFile(options.osModel));
    RFPtr rf(lumo::gdal::ReadImageRPC(options.osImage));
    return MakeRpcModelObject(ShareRFRecord(std::move(rf)), image.nPixels, image.nLines);
}

void RunOrtho(OrthoCommandOptions& options, CommandContext& context) {
    const auto start = std::chrono::steady_clock::now();
    lumo::gdal::OrthoOptions& ortho = options.sOrtho;
    ortho.eResampling = ParseResampling(options.osResampling);
    if (!options.adfExtent.empty()) {
        ortho.bHasExtent = true;
        std::copy(options.adfExtent.begin(), options.adfExtent.end(), ortho.adfExtent);
    }
    ortho.bHasNoData = options.poNoData->count() > 0;
    ortho.dfNoData = options.dfNoData;

    const lumo::gdal::ImageInfo image = lumo::gdal::ReadImageInfo(options.osImage);
    const std::unique_ptr<nova::mathmodel::IMathModel> model = OpenModel(options, image);
    const nova::dem::DEMPtr dem = OpenElevation(options.osDem, options.osDemHeights);

    InterruptGuard interrupts;
    Progress progress("ortho", 1000);
    std::mutex progressMutex;
    ortho.fnProgress = [&](double fraction) {
        std::lock_guard<std::mutex> lock(progressMutex);
        progress.Update(static_cast<std::size_t>(fraction * 1000.0));
        return !gbInterrupted.load();
    };
    const lumo::gdal::OrthoGrid grid =
        lumo::gdal::Orthorectify(options.osImage, *model, *dem, options.osOutput, ortho);
    const double seconds =
        std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    const nova::ogc::CRSPtr crs(nova::ogc::utils::CreateCRSFromDefinition(grid.osCRS));
    context.out << "wrote " << options.osOutput << ": " << grid.nPixels << " x " << grid.nLines
                << " pixels of " << grid.adfGeoTransform[1] << " in " << crs->GetName() << ", "
                << image.aosBandTypes.size() << " band(s), in " << FormatShort(seconds) << " s\n";
}

}  // namespace

void AddOrthoCommand(CLI::App& app, CommandContext& context) {
    auto options = std::make_shared<OrthoCommandOptions>();
    CLI::App* command = app.add_subcommand(
        "ortho", "Orthorectify an image with a model and an elevation model into a GeoTIFF");
    command->add_option("IMAGE", options->osImage, "image (any raster GDAL reads)")->required();
    command->add_option("OUTPUT", options->osOutput, "GeoTIFF to write")->required();
    command->add_option("--model", options->osModel,
                        "model file (JSON); default: the image's own rational polynomials");
    AddElevationOptions(*command, options->osDem, options->osDemHeights);
    command->add_option("--crs", options->sOrtho.osOutputCRS,
                        "output CRS: EPSG code, PROJ string or WKT (default: the model's if "
                        "projected, else the local UTM zone)");
    command
        ->add_option("--resolution", options->sOrtho.dfResolution,
                     "output pixel size in CRS units (default: the model's ground sample "
                     "distance)")
        ->check(CLI::PositiveNumber);
    command
        ->add_option("--extent", options->adfExtent,
                     "output extent: MINX MINY MAXX MAXY (default: the image footprint)")
        ->expected(4);
    command
        ->add_option("--resampling", options->osResampling, "nearest, bilinear, cubic or lanczos")
        ->check(CLI::IsMember({"nearest", "bilinear", "cubic", "lanczos"}));
    options->poNoData = command->add_option(
        "--nodata", options->dfNoData, "value of uncovered pixels (default: the image's, else 0)");
    command->add_option("--threads", options->sOrtho.nThreads, "warp threads (default: all cores)")
        ->check(CLI::NonNegativeNumber);
    command
        ->add_option("--error-threshold", options->sOrtho.dfErrorThreshold,
                     "largest geometric approximation error, image pixels (default 0.125)")
        ->check(CLI::PositiveNumber);
    command->add_flag("--cog", options->sOrtho.bCloudOptimized,
                      "write a cloud-optimised GeoTIFF (with overviews)");
    command->callback([options, &context] { RunOrtho(*options, context); });
}

}  // namespace lumo::cli
