// The subcommands of the lumo tool. Each command file provides one Add...
// function; cli.cpp lists them in its command table, so a new model family
// adds its file and one line there.
#pragma once

#include <iosfwd>
#include <string>
#include <vector>

#include "fit_refine.h"
#include "lumo_sim.h"
#include "model_io.h"
#include "point_prep.h"
#include "transform.h"

namespace CLI {
class App;
}

namespace lumo::cli {

// Exit statuses of the tool.
constexpr int kExitSuccess = 0;       // everything done, every point computed
constexpr int kExitFailed = 1;        // the operation failed; nothing half-written is left
constexpr int kExitUsage = 2;         // unknown command or option, bad option value
constexpr int kExitPointsFailed = 3;  // the run completed, but some points failed

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
void AddRpcCommand(CLI::App& app, CommandContext& context);
void AddFitCommand(CLI::App& app, CommandContext& context);
void AddResidualsCommand(CLI::App& app, CommandContext& context);
void AddGcpsCommand(CLI::App& app, CommandContext& context);
void AddSegmentCommand(CLI::App& app, CommandContext& context);
void AddSimulateCommand(CLI::App& app, CommandContext& context);
void AddBlockCommand(CLI::App& app, CommandContext& context);
void AddSimulateAvhrrCommand(CLI::App& app, CommandContext& context);
void AddAnglesCommand(CLI::App& app, CommandContext& context);
// Commands that read rasters: present when the tool is built with GDAL, and
// otherwise reporting that it is not.
void AddInfoCommand(CLI::App& app, CommandContext& context);
void AddOrthoCommand(CLI::App& app, CommandContext& context);
// `lumo demo`'s last part: the block adjustment of the bundled stereo pair
// with tie points (examples/block_stereo.json).
void PrintBlockDemo(const std::string& examplesDir, std::ostream& out);
// `lumo demo`'s orbit part: the bundled AVHRR pass, its refinement and angles.
void PrintOrbitDemo(const std::string& examplesDir, std::ostream& out);

// The points of a simulated scene as a point file (id, pixel, line, x, y, z),
// ids made of pszPrefix and a count; osGeosys is declared when not empty.
std::string SimulatedPointText(const std::vector<lumo::sim::SimPoint>& asPoints,
                               const char* pszPrefix, const std::string& osGeosys = "");

// --elevation-scale classic|curved of the rigorous fits (fit, block): the
// form of the equations' elevation scale; curved unless asked otherwise.
void AddElevationScaleOption(CLI::App& command, std::string& word);

struct SritFitOptions {
    std::string osSegment;                       // the image's ephemeris segment file
    std::string osOutput;                        // the model file to write
    int32_t nForm = SRIT_FORM_CURVED_INCIDENCE;  // --elevation-scale
    RefineOptions sRefine;
};

// `lumo fit --model srit`: the rigorous model of the image of the segment
// from control points with heights, ground coordinates in `geosys` (empty:
// the segment's), in the form asked for, written to the output. With
// refinement enabled, blunders are dropped first (see fit_refine.h).
void RunSritFit(const PointSet& gcps, const SritFitOptions& options, const std::string& geosys,
                CommandContext& context);

// `lumo fit --model rf`: the image-space adjustment of the model in `osRpc`
// (any of its forms) fitted to control points with heights, written to
// `osOutput` in the form its extension names.
struct RFFitOptions {
    std::string osRpc;
    std::string osAdjust = "affine";  // shift, affine or second
    std::string osOutput;
    int nPixels = -1;  // -1: the input model file's, else 0
    int nLines = -1;
    PointFileOptions sPoints;  // --geosys of the control points
    RefineOptions sRefine;
};
void RunRFFit(PointSet& gcps, const RFFitOptions& options, CommandContext& context);

// `lumo fit --model rtcs`: the radar model of the image of `segmentPath` from
// the control points (with heights in `heightRef`, "E" or "M") of `gcps`,
// ground coordinates in `geosys`, written to `outputPath`.
void RunRtcsFit(const PointSet& gcps, const std::string& segmentPath, const std::string& geosys,
                const std::string& heightRef, const std::string& outputPath,
                CommandContext& context);

// Arguments of the point-transform commands (transform and the per-family
// commands): MODEL --to-image|--to-ground POINTS [-o OUT] with the point
// file options.
struct TransformOptions {
    std::string osModel;
    std::string osToImage;
    std::string osToGround;
    std::string osOutput;
    PointFileOptions sPoints;
    RigorousForm eForm = RigorousForm::Exact;  // transform --closed-form
};

// Adds the shared arguments to a command; exactly one direction is accepted.
void AddTransformArguments(CLI::App& command, TransformOptions& options);
// --closed-form (and the old --exact, now the default) for the rigorous model.
void AddRigorousFormFlags(CLI::App& command, RigorousForm& form);
// Fails when --closed-form was given for a model that is not rigorous.
void RequireRigorousForClosedForm(RigorousForm form, const LoadedModel& model);
// Fails with a usage error when neither direction was given.
void RequireDirection(const TransformOptions& options);
// Maps the chosen point file through `model` and writes the result.
void RunTransformOptions(const TransformOptions& options, const LoadedModel& model,
                         CommandContext& context);

}  // namespace lumo::cli
