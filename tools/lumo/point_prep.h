// Preparing a point file for a model: heights for the models whose results
// depend on them, ground coordinates in the model's georeferencing, and the
// rule for points that fail, shared by every command that evaluates a model
// point by point.
#pragma once

#include <iosfwd>
#include <string>
#include <vector>

#include "model_io.h"
#include "points_io.h"

namespace CLI {
class App;
}

namespace lumo::cli {

struct CommandContext;

// Options of the commands that evaluate a model on a point file.
struct PointFileOptions {
    std::string osGeosys;  // --geosys: georeferencing of the file's ground coordinates
    double dfHeight = 0.0;
    bool bHeightGiven = false;  // --height: the height of every point of a file without z
    bool bKeepGoing = false;    // --keep-going: failed points do not change the exit status
};

// Adds --height to a command.
void AddHeightOption(CLI::App& command, PointFileOptions& options);
// Adds --geosys, --height and --keep-going to a command.
void AddPointFileOptions(CLI::App& command, PointFileOptions& options);

// A point as messages name it: file and line, and its id when it has one.
std::string PointName(const PointSet& points, const PointRecord& p);

// True for a real position: both values finite and neither the null value.
bool IsPosition(double a, double b);

// True when the family's results depend on the height: every family but the
// polynomial and the spline, including those the tool learns later.
bool ModelUsesHeight(int nModelCode);

// Gives the points of a file without a z column the --height value. A file
// with neither is refused when bNeedHeights (naming `osUser`, the model or
// command that needs them), rather than taken at height 0; --height with a
// z column is refused as contradictory.
void ApplyHeights(PointSet& points, const PointFileOptions& options, bool bNeedHeights,
                  const std::string& osUser);

// A georeferencing of ground coordinates; empty text when not known.
struct Georef {
    std::string osGeosys;
    std::string osProjParms;
    ProjInfo_t sProj{};

    bool Known() const { return !osGeosys.empty(); }
};

// The model's ground georeferencing, from its file's envelope.
Georef ModelGeoref(const LoadedModel& model);
// The georeferencing a point file declares: --geosys, else its "# geosys:"
// comment; the two must agree when both are given.
Georef DeclaredGeoref(const PointSet& points, const PointFileOptions& options);

struct GroundXY {
    double x = 0.0;
    double y = 0.0;
};

// The points' ground coordinates in the model's georeferencing. Declared
// coordinates are converted (heights are not changed); a point that cannot
// be converted is failed with `pszFailure`. Undeclared coordinates are
// taken to be the model's and the file is refused when a value is
// impossible there; values that merely look like degrees against a projected
// model give a warning on `err`.
std::vector<GroundXY> GroundInModelSystem(PointSet& points, const Georef& declared,
                                          const Georef& model, const char* pszFailure,
                                          std::ostream& err);

// Records in the set the georeferencing its ground coordinates are in.
void DeclareGeoref(PointSet& points, const Georef& georef);

// Converts computed ground coordinates (x, y of points not failed) from the
// model's georeferencing into the declared one, failing points that cannot
// be converted with `pszFailure`; the set then declares what it holds.
void GroundToDeclaredSystem(PointSet& points, const Georef& model, const Georef& declared,
                            const char* pszFailure);

// After a run: names the first failed points and their reasons on standard
// error with the count, and sets the exit status 3 unless --keep-going.
void ReportFailedPoints(const PointSet& points, const std::string& osCommand, bool bKeepGoing,
                        CommandContext& context);

}  // namespace lumo::cli
