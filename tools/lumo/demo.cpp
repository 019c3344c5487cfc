#include "demo.h"

#include <unistd.h>

#include <climits>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <ostream>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"
#ifdef LUMO_HAVE_GDAL
#include "gdal_commands.h"
#endif
#include "model_io.h"
#include "points_io.h"
#include "transform.h"

namespace lumo::cli {
namespace {

namespace fs = std::filesystem;

constexpr int kGridSteps = 8;  // the round-trip grid has (steps + 1)^2 nodes

struct GroundPoint {
    double x, y, z;
};
struct ImagePoint {
    double pixel, line;
};

ImagePoint ToImage(const LoadedModel& model, const GroundPoint& g) {
    ImagePoint i{0.0, 0.0};
    if (!GroundToImage(model, g.x, g.y, g.z, &i.pixel, &i.line) || !IsPosition(i.pixel, i.line)) {
        LUMO_CLI_FAIL(model.sEnvelope.osSource + ": the model cannot map ground point (" +
                      FormatDouble(g.x) + ", " + FormatDouble(g.y) + ") to the image");
    }
    return i;
}

GroundPoint ToGround(const LoadedModel& model, const ImagePoint& i, double z) {
    GroundPoint g{0.0, 0.0, z};
    if (!model.ImageToGround(i.pixel, i.line, z, &g.x, &g.y) || !IsPosition(g.x, g.y)) {
        LUMO_CLI_FAIL(model.sEnvelope.osSource + ": the model cannot map image point (" +
                      FormatDouble(i.pixel) + ", " + FormatDouble(i.line) + ") to the ground");
    }
    return g;
}

double Distance(const GroundPoint& a, const GroundPoint& b) {
    return std::hypot(a.x - b.x, a.y - b.y);
}
double Distance(const ImagePoint& a, const ImagePoint& b) {
    return std::hypot(a.pixel - b.pixel, a.line - b.line);
}

void AddRoundTrips(const LoadedModel& model, const GroundPoint& ground, const ImagePoint& image,
                   DemoResult& result) {
    const GroundPoint groundBack = ToGround(model, ToImage(model, ground), ground.z);
    result.sGroundRoundTrip.Add(Distance(ground, groundBack));
    const ImagePoint imageBack = ToImage(model, ToGround(model, image, ground.z));
    result.sImageRoundTrip.Add(Distance(image, imageBack));
}

// Round trips over a grid of image positions covering the whole image.
void AddGridRoundTrips(const LoadedModel& model, DemoResult& result) {
    const double width = model.sEnvelope.nPixels;
    const double height = model.sEnvelope.nLines;
    for (int i = 0; i <= kGridSteps; ++i) {
        for (int j = 0; j <= kGridSteps; ++j) {
            const ImagePoint image{width * i / kGridSteps, height * j / kGridSteps};
            AddRoundTrips(model, ToGround(model, image, 0.0), image, result);
        }
    }
}

std::string ExecutableDir() {
    std::error_code error;
    const fs::path exe = fs::read_symlink("/proc/self/exe", error);
    return error ? std::string() : exe.parent_path().string();
}

std::string Cell(double value) {
    char text[32];
    std::snprintf(text, sizeof text, "%.3g", value);
    return text;
}

std::string Pair(const ErrorStats& stats) {
    return Cell(stats.dfMax) + " / " + Cell(stats.Rms());
}

}  // namespace

const std::vector<FamilyDemo>& FamilyDemos() {
    static const std::vector<FamilyDemo> demos = {
        {"poly", "poly_utm31.json", "poly_utm31_gcps.csv"},
        {"rf", "rf_scene.json", "rf_scene_gcps.csv"},
        {"tps", "tps_utm31.json", "poly_utm31_gcps.csv"},
        {"ap", "ap_frame_utm31.json", "ap_frame_utm31_gcps.csv"},
        {"srit", "srit_spot5_roll20.json", "srit_spot5_roll20_checks.csv"},
        {"rtcs", "rtcs_scene.json", "rtcs_scene_checks.csv"},
        {"lrs", "lrs_avhrr_pass.json", "avhrr_pass_checks.csv"},
    };
    return demos;
}

void ErrorStats::Add(double distance) {
    ++nCount;
    dfMax = std::max(dfMax, distance);
    dfSumSquares += distance * distance;
}

double ErrorStats::Rms() const {
    return nCount ? std::sqrt(dfSumSquares / nCount) : 0.0;
}

DemoResult RunFamilyDemo(const FamilyDemo& demo, const std::string& examplesDir) {
    const LoadedModel model = ReadModelFile((fs::path(examplesDir) / demo.pszModelFile).string());
    const PointSet gcps =
        ReadPointsFile((fs::path(examplesDir) / demo.pszGcpFile).string(), PointKind::ControlPoint);
    DemoResult result;
    result.osFamily = demo.pszFamily;
    result.osModelFile = demo.pszModelFile;
    result.nGcps = gcps.asPoints.size();
    for (const PointRecord& p : gcps.asPoints) {
        const GroundPoint ground{p.dfX, p.dfY, p.dfZ};
        const ImagePoint image{p.dfPixel, p.dfLine};
        result.sImageResidual.Add(Distance(ToImage(model, ground), image));
        result.sGroundResidual.Add(Distance(ToGround(model, image, p.dfZ), ground));
        AddRoundTrips(model, ground, image, result);
    }
    AddGridRoundTrips(model, result);
    return result;
}

std::string FindExamplesDir() {
    std::vector<std::string> candidates;
    if (const char* env = std::getenv("LUMO_EXAMPLES_DIR"); env != nullptr && *env != '\0') {
        candidates.emplace_back(env);
    }
#ifdef LUMO_EXAMPLES_DIR
    candidates.emplace_back(LUMO_EXAMPLES_DIR);
#endif
    if (const std::string dir = ExecutableDir(); !dir.empty()) {
        candidates.push_back((fs::path(dir) / ".." / "share" / "lumo" / "examples").string());
    }
    std::string tried;
    for (const std::string& dir : candidates) {
        std::error_code error;
        if (fs::is_directory(dir, error)) return dir;
        tried += (tried.empty() ? "" : ", ") + dir;
    }
    LUMO_CLI_FAIL("examples directory not found (looked in: " + tried + "); set LUMO_EXAMPLES_DIR");
}

void PrintDemo(const std::string& examplesDir, std::ostream& out, const std::string& outputDir) {
    out << "lumo demo: sample models in " << examplesDir << "\n"
        << "residuals against the control points; round trips on the control points and a "
        << (kGridSteps + 1) << "x" << (kGridSteps + 1) << " image grid\n"
        << "errors as max / rms; image in pixels, ground in ground units\n\n";
    char line[256];
    std::snprintf(line, sizeof line, "%-8s %-22s %5s  %-21s %-21s %-21s %s\n", "family", "model",
                  "gcps", "image residual", "ground residual", "ground->image->ground",
                  "image->ground->image");
    out << line;
    for (const FamilyDemo& demo : FamilyDemos()) {
        const DemoResult r = RunFamilyDemo(demo, examplesDir);
        std::snprintf(line, sizeof line, "%-8s %-22s %5zu  %-21s %-21s %-21s %s\n",
                      r.osFamily.c_str(), r.osModelFile.c_str(), r.nGcps,
                      Pair(r.sImageResidual).c_str(), Pair(r.sGroundResidual).c_str(),
                      Pair(r.sGroundRoundTrip).c_str(), Pair(r.sImageRoundTrip).c_str());
        out << line;
    }
    PrintOrbitDemo(examplesDir, out);
    PrintBlockDemo(examplesDir, out);
#ifdef LUMO_HAVE_GDAL
    PrintOrthoDemo(examplesDir, outputDir, out);
#else
    static_cast<void>(outputDir);
#endif
}

void AddDemoCommand(CLI::App& app, CommandContext& context) {
    CLI::App* command =
        app.add_subcommand("demo", "Evaluate the sample models both ways and print their errors");
    auto outputDir = std::make_shared<std::string>(".");
    command->add_option("--output-dir", *outputDir,
                        "where the demo's orthoimage and quick-look go (default: here)");
    command->callback(
        [&context, outputDir] { PrintDemo(FindExamplesDir(), context.out, *outputDir); });
}

}  // namespace lumo::cli
