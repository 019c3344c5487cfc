// `lumo gcps convert --geosys TEXT --height-ref E|M IN.csv [-o OUT.csv]`:
// control points from any projection and height reference to WGS 84
// longitude, latitude and ellipsoidal height.
#include <cstdio>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"
#include "geosys_option.h"
#include "lumo_gcp.h"
#include "nova/projection.h"
#include "point_prep.h"
#include "points_io.h"

namespace lumo::cli {
namespace {

struct GcpsConvertOptions {
    std::string osGeosys;
    std::string osHeightRef;
    std::string osInput;
    std::string osOutput;
    PointFileOptions sPoints;  // --height
};

std::vector<ControlPoint_t> ToControlPoints(const PointSet& points) {
    std::vector<ControlPoint_t> asGcps;
    asGcps.reserve(points.asPoints.size());
    for (const PointRecord& p : points.asPoints) {
        asGcps.push_back({p.dfPixel, p.dfLine, p.dfX, p.dfY, p.dfZ});
    }
    return asGcps;
}

// The library numbers a point that cannot be converted from 1 in file order;
// the message gains the file, line and id of that point.
[[noreturn]] void FailConversion(const PointSet& points, const nova::DataException& e) {
    std::string osWhere = points.osSource;
    std::size_t nNumber = 0;
    if (std::sscanf(e.GetMessage().c_str(), "Could not transform GCP %zu", &nNumber) == 1 &&
        nNumber >= 1 && nNumber <= points.asPoints.size()) {
        const PointRecord& p = points.asPoints[nNumber - 1];
        osWhere += ":" + std::to_string(p.nSourceLine);
        if (!p.osId.empty()) osWhere += " (id " + Quoted(p.osId) + ")";
    }
    LUMO_CLI_FAIL(osWhere + ": " + e.GetMessage());
}

void RunGcpsConvert(const GcpsConvertOptions& options, CommandContext& context) {
    PointSet points = ReadPointsFile(options.osInput, PointKind::ControlPoint);
    NoteDisabledPoints(points, "lumo gcps convert", context.err);
    // --geosys, else what the file declares ("# geosys:" or a georeferencer's
    // "#CRS:" line); the two must agree when both are given.
    PointFileOptions given = options.sPoints;
    given.osGeosys = options.osGeosys;
    const Georef declared = DeclaredGeoref(points, given);
    if (!declared.Known()) {
        LUMO_CLI_FAIL("--geosys is required: " + options.osInput +
                      " does not declare the georeferencing of its ground coordinates");
    }
    const ProjInfo_t sProj = declared.sProj;
    // The converted heights depend on the heights given: none are assumed.
    ApplyHeights(points, options.sPoints, true, "the datum conversion");
    std::vector<ControlPoint_t> asGcps = ToControlPoints(points);
    std::vector<double> x, y;
    for (const ControlPoint_t& gcp : asGcps) {
        x.push_back(gcp.dfGroundX);
        y.push_back(gcp.dfGroundY);
    }
    WarnOutsideUTMBand(sProj, x, y, "lumo gcps convert", context.err);
    try {
        ConvertGcpsToWgs84Ell(sProj, options.osHeightRef, asGcps);
    } catch (const nova::ParameterException& e) {
        LUMO_CLI_FAIL("--geosys " + Quoted(declared.osGeosys) + ": " + e.GetMessage());
    } catch (const nova::DataException& e) {
        FailConversion(points, e);
    }
    points.osGeosys = "LONG/LAT D000";  // WGS 84 longitude and latitude
    points.osProjParms.clear();
    for (std::size_t i = 0; i < asGcps.size(); ++i) {
        points.asPoints[i].dfX = asGcps[i].dfGroundX;
        points.asPoints[i].dfY = asGcps[i].dfGroundY;
        points.asPoints[i].dfZ = asGcps[i].dfGroundZ;
    }

    std::vector<PointColumn> columns;
    if (points.bHasId) columns.push_back(PointColumn::Id);
    columns.insert(columns.end(), {PointColumn::Pixel, PointColumn::Line, PointColumn::X,
                                   PointColumn::Y, PointColumn::Z});
    if (options.osOutput.empty()) {
        WritePoints(context.out, points, columns);
        return;
    }
    std::ostringstream text;
    WritePoints(text, points, columns);
    WriteFileReplacing(options.osOutput, text.str());
}

}  // namespace

void AddGcpsCommand(CLI::App& app, CommandContext& context) {
    CLI::App* gcps = app.add_subcommand("gcps", "Work on control point files");
    gcps->require_subcommand(1);
    auto options = std::make_shared<GcpsConvertOptions>();
    CLI::App* convert = gcps->add_subcommand(
        "convert", "Convert control points to WGS 84 longitude, latitude and ellipsoidal height");
    convert->add_option("--geosys", options->osGeosys,
                        "georeferencing text of the ground x, y (default: the file's declaration)");
    convert
        ->add_option("--height-ref", options->osHeightRef,
                     "heights above mean sea level (M, EGM96 geoid) or the ellipsoid (E)")
        ->required()
        ->check(CLI::IsMember({"E", "M"}));
    convert->add_option("points", options->osInput, "control points (CSV with pixel,line,x,y[,z])")
        ->required();
    convert->add_option("-o,--output", options->osOutput,
                        "output CSV file (standard output when not given)");
    AddHeightOption(*convert, options->sPoints);
    convert->callback([options, &context] { RunGcpsConvert(*options, context); });
}

}  // namespace lumo::cli
