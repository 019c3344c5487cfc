#include "point_prep.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <iterator>
#include <ostream>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"
#include "geosys_option.h"
#include "nova/projection.h"

namespace lumo::cli {
namespace {

// Failed points named one by one on standard error; the rest are counted.
constexpr std::size_t kNamedFailures = 5;

Georef MakeGeoref(const std::string& osGeosys, const std::string& osProjParms,
                  const std::string& osWhere) {
    Georef g;
    g.osGeosys = osGeosys;
    g.osProjParms = osProjParms;
    g.sProj = UserGeosys(osGeosys, osWhere);
    if (!osProjParms.empty() && ProjParms2Info(osProjParms.c_str(), &g.sProj) != 0) {
        LUMO_CLI_FAIL(osWhere + ": cannot apply the projection parameters " + Quoted(osProjParms));
    }
    return g;
}

bool SameSystem(const Georef& a, const Georef& b) {
    if (std::strcmp(a.sProj.szProj, b.sProj.szProj) != 0) return false;
    if (RequiresProjInfo(a.sProj.nProjKind) == 0) return true;
    return std::equal(std::begin(a.sProj.adfProjParms), std::end(a.sProj.adfProjParms),
                      std::begin(b.sProj.adfProjParms));
}

// Whether the file's points mean the same places in both systems: one
// system has several texts ("EPSG:4326" and "LONG/LAT D000"), so texts that
// differ are compared by converting an even sample of the points, which must
// not move by more than a hundredth of a millimetre.
bool SameForPoints(const Georef& a, const Georef& b, const PointSet& points) {
    if (SameSystem(a, b)) return true;
    constexpr std::size_t kSamples = 64;
    const double dfTolerance = b.sProj.nProjKind == NOVA_PROJ_GEOGRAPHIC ? 1e-10 : 1e-5;
    const std::size_t n = points.asPoints.size();
    const std::size_t nStep = std::max<std::size_t>(1, n / kSamples);
    bool bCompared = false;
    for (std::size_t i = 0; i < n; i += nStep) {
        const PointRecord& p = points.asPoints[i];
        if (!IsPosition(p.dfX, p.dfY)) continue;
        double x = 0.0, y = 0.0;
        if (GCTPTransform(&a.sProj, p.dfX, p.dfY, &b.sProj, &x, &y) != 0 ||
            !(std::fabs(x - p.dfX) <= dfTolerance && std::fabs(y - p.dfY) <= dfTolerance)) {
            return false;
        }
        bCompared = true;
    }
    return bCompared;
}

bool IsProjected(const Georef& g) {
    const int kind = g.sProj.nProjKind;
    return kind != NOVA_PROJ_GEOGRAPHIC && kind != NOVA_PROJ_PIXEL && kind != NOVA_PROJ_METRE &&
           kind != NOVA_PROJ_UNKNOWN;
}

// Why (x, y) cannot be a position in `g`; empty when it can, or when the
// system has no bounds to judge by (pixels, plain metres).
std::string Impossibility(const Georef& g, double x, double y) {
    if (g.sProj.nProjKind == NOVA_PROJ_GEOGRAPHIC) {
        if (std::fabs(y) > 90.0) return "y = " + FormatDouble(y) + " is not a latitude";
        if (std::fabs(x) > 360.0) return "x = " + FormatDouble(x) + " is not a longitude";
        return "";
    }
    if (!IsProjected(g)) return "";
    static const Georef lonLat = MakeGeoref("LONG/LAT D000", "", "");
    double lon = 0.0, lat = 0.0;
    if (GCTPTransform(&g.sProj, x, y, &lonLat.sProj, &lon, &lat) != 0 || !std::isfinite(lon) ||
        !std::isfinite(lat)) {
        return "(" + FormatDouble(x) + ", " + FormatDouble(y) + ") has no place on the Earth";
    }
    return "";
}

void CheckUndeclared(const PointSet& points, const Georef& model, std::ostream& err) {
    bool bAllDegrees = !points.asPoints.empty();
    for (const PointRecord& p : points.asPoints) {
        const std::string why = Impossibility(model, p.dfX, p.dfY);
        if (!why.empty()) {
            LUMO_CLI_FAIL(PointName(points, p) + ": " + why + " in the model's ground system " +
                          Quoted(model.osGeosys) +
                          "; if the file uses another, declare it with a \"# geosys: TEXT\" "
                          "line or --geosys");
        }
        bAllDegrees = bAllDegrees && std::fabs(p.dfX) <= 180.0 && std::fabs(p.dfY) <= 90.0;
    }
    if (bAllDegrees && IsProjected(model)) {
        err << "lumo: warning: the ground coordinates of " << points.osSource
            << " look like degrees, but the model's are in " << Quoted(model.osGeosys)
            << "; declare the file's georeferencing with a \"# geosys: TEXT\" line or --geosys\n";
    }
}

}  // namespace

void AddHeightOption(CLI::App& command, PointFileOptions& options) {
    command
        .add_option_function<double>(
            "--height",
            [&options](double value) {
                options.dfHeight = value;
                options.bHeightGiven = true;
            },
            "height (metres) of every point of a file without a z column")
        ->check(CLI::Range(-1e5, 1e5));
}

void AddPointFileOptions(CLI::App& command, PointFileOptions& options) {
    command.add_option("--geosys", options.osGeosys,
                       "georeferencing of the point file's ground coordinates (default: its "
                       "\"# geosys:\" line, else the model's); they are converted to the model's");
    AddHeightOption(command, options);
    command.add_flag("--keep-going", options.bKeepGoing,
                     "exit with status 0 even when some points fail");
}

std::string PointName(const PointSet& points, const PointRecord& p) {
    std::string name = points.osSource + ":" + std::to_string(p.nSourceLine);
    if (!p.osId.empty()) name += " (id " + Quoted(p.osId) + ")";
    return name;
}

bool IsPosition(double a, double b) {
    return std::isfinite(a) && std::isfinite(b) && a != LUMO_NULL_VALUE && b != LUMO_NULL_VALUE;
}

bool ModelUsesHeight(int nModelCode) {
    return nModelCode != LUMO_CODE_POLY && nModelCode != LUMO_CODE_TPS;
}

void ApplyHeights(PointSet& points, const PointFileOptions& options, bool bNeedHeights,
                  const std::string& osUser) {
    if (points.bHasZ) {
        if (options.bHeightGiven) {
            LUMO_CLI_FAIL(points.osSource +
                          " has a z column; --height applies only to files without one");
        }
        return;
    }
    if (!options.bHeightGiven) {
        if (!bNeedHeights) return;
        LUMO_CLI_FAIL(points.osSource + " has no z column, and the results of " + osUser +
                      " depend on the height: add a z column or give --height METRES");
    }
    for (PointRecord& p : points.asPoints) p.dfZ = options.dfHeight;
    points.bHasZ = true;
}

Georef ModelGeoref(const LoadedModel& model) {
    const ModelEnvelope& e = model.sEnvelope;
    if (e.osGeosys.empty()) return Georef{};
    return MakeGeoref(e.osGeosys, e.osProjParms, e.osSource + ": field \"geosys\"");
}

Georef DeclaredGeoref(const PointSet& points, const PointFileOptions& options) {
    Georef fromFile;
    if (!points.osGeosys.empty()) {
        fromFile = MakeGeoref(points.osGeosys, points.osProjParms,
                              points.osSource + ": the \"# geosys:\" comment");
    }
    if (options.osGeosys.empty()) return fromFile;
    Georef given = MakeGeoref(options.osGeosys, points.osProjParms, "--geosys");
    if (fromFile.Known() && !SameForPoints(fromFile, given, points)) {
        LUMO_CLI_FAIL("--geosys " + Quoted(options.osGeosys) + " contradicts " + points.osSource +
                      ", which declares " + Quoted(points.osGeosys));
    }
    return given;
}

std::vector<GroundXY> GroundInModelSystem(PointSet& points, const Georef& declared,
                                          const Georef& model, const char* pszFailure,
                                          std::ostream& err) {
    std::vector<GroundXY> ground;
    ground.reserve(points.asPoints.size());
    for (const PointRecord& p : points.asPoints) ground.push_back({p.dfX, p.dfY});
    if (!model.Known()) return ground;
    if (!declared.Known()) {
        CheckUndeclared(points, model, err);
        return ground;
    }
    if (SameSystem(declared, model)) return ground;
    for (std::size_t i = 0; i < ground.size(); ++i) {
        PointRecord& p = points.asPoints[i];
        if (GCTPTransform(&declared.sProj, p.dfX, p.dfY, &model.sProj, &ground[i].x,
                          &ground[i].y) != 0 ||
            !IsPosition(ground[i].x, ground[i].y)) {
            p.Fail(pszFailure, "cannot convert the ground position from " +
                                   Quoted(declared.osGeosys) + " to the model's " +
                                   Quoted(model.osGeosys));
        }
    }
    return ground;
}

void DeclareGeoref(PointSet& points, const Georef& georef) {
    points.osGeosys = georef.osGeosys;
    points.osProjParms = georef.osProjParms;
}

void GroundToDeclaredSystem(PointSet& points, const Georef& model, const Georef& declared,
                            const char* pszFailure) {
    DeclareGeoref(points, declared.Known() ? declared : model);
    if (!declared.Known() || !model.Known() || SameSystem(declared, model)) return;
    for (PointRecord& p : points.asPoints) {
        if (p.Failed()) continue;
        double x = 0.0, y = 0.0;
        if (GCTPTransform(&model.sProj, p.dfX, p.dfY, &declared.sProj, &x, &y) != 0 ||
            !IsPosition(x, y)) {
            p.Fail(pszFailure, "cannot convert the ground position from the model's " +
                                   Quoted(model.osGeosys) + " to " + Quoted(declared.osGeosys));
            continue;
        }
        p.dfX = x;
        p.dfY = y;
    }
}

void ReportFailedPoints(const PointSet& points, const std::string& osCommand, bool bKeepGoing,
                        CommandContext& context) {
    std::size_t nFailed = 0;
    for (const PointRecord& p : points.asPoints) {
        if (!p.Failed()) continue;
        if (++nFailed <= kNamedFailures) {
            context.err << "lumo " << osCommand << ": " << PointName(points, p) << ": "
                        << p.osStatus << ": " << p.osProblem << "\n";
        }
    }
    if (nFailed == 0) return;
    context.err << "lumo " << osCommand << ": " << nFailed << " of " << points.asPoints.size()
                << " points failed (empty fields, see the status column)\n";
    if (!bKeepGoing) context.nExitCode = kExitPointsFailed;
}

}  // namespace lumo::cli
