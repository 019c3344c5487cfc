// Point files: comma-separated text with a header line naming the columns.
// One reader serves ground points, image points and control points.
#pragma once

#include <iosfwd>
#include <string>
#include <utility>
#include <vector>

namespace lumo::cli {

// Which coordinates a point file must carry.
enum class PointKind {
    Ground,        // x, y; z optional
    Image,         // pixel, line; z optional
    ControlPoint,  // pixel, line, x, y; z optional
};

// Columns the reader recognises and the writer can emit. Status is written
// only: it says whether the point's computation succeeded.
enum class PointColumn { Id, Pixel, Line, X, Y, Z, Status };

// Words of the status column.
constexpr const char* kStatusOk = "ok";
constexpr const char* kFailedToImage = "failed-to-image";
constexpr const char* kFailedToGround = "failed-to-ground";
constexpr const char* kFailedBothWays = "failed-both-ways";

struct PointRecord {
    std::string osId;  // empty when the file has no id column
    double dfPixel = 0.0;
    double dfLine = 0.0;
    double dfX = 0.0;
    double dfY = 0.0;
    double dfZ = 0.0;     // 0 when the file has no z column
    int nSourceLine = 0;  // line of the file the point came from, counted from 1
    // Outcome of the computation made for the point: kStatusOk, or a failure
    // word with the reason in osProblem. A failed point's computed columns
    // are written empty, never as a position.
    std::string osStatus = kStatusOk;
    std::string osProblem;

    bool Failed() const { return osStatus != kStatusOk; }
    void Fail(const char* pszStatus, std::string problem) {
        osStatus = pszStatus;
        osProblem = std::move(problem);
    }
};

struct PointSet {
    std::string osSource;  // file name used in messages
    bool bHasId = false;
    bool bHasZ = false;
    // Georeferencing of the ground coordinates, declared by "# geosys: TEXT"
    // (and "# projParms: TEXT") comment lines ahead of the first point;
    // empty when not declared. The writer declares it the same way.
    std::string osGeosys;
    std::string osProjParms;
    std::vector<PointRecord> asPoints;
    // Points a georeferencer's .points file marks as not enabled, left out.
    std::size_t nDisabled = 0;
};

// Name of a column as it appears in a header.
const char* PointColumnName(PointColumn column);

// Reads a point file. Column names are matched without regard to case and
// surrounding blanks; unknown columns are ignored; lines whose first non-blank
// character is '#' and blank lines are skipped. Two layouts of other tools
// are recognised from the header: a desktop GIS georeferencer's .points file
// (mapX, mapY, pixelX or sourceX, pixelY or sourceY, enable; its "#CRS:" line
// declares the georeferencing, its image Y is the negated line, and points
// not enabled are counted in nDisabled and left out), and a plain list
// separated by blanks, with a header or, for control points, without one
// (pixel line X Y [Z] on every line). Throws nova::DataException
// naming the source (and line and column) for a missing header, a missing or
// repeated column, a line with the wrong number of fields and a value that is
// not a finite number, and for a repeated georeferencing comment.
PointSet ReadPoints(std::istream& in, const std::string& source, PointKind kind);
PointSet ReadPointsFile(const std::string& path, PointKind kind);
// Says on `err`, behind `command`, how many points the file left out as not
// enabled (nothing when none).
void NoteDisabledPoints(const PointSet& points, const std::string& command, std::ostream& err);

// Writes the georeferencing comments, the header and one line per point with
// the given columns. Numbers are written in the shortest form that reads
// back to the same double; the `computed` columns of a failed point are
// left empty.
void WritePoints(std::ostream& out, const PointSet& points, const std::vector<PointColumn>& columns,
                 const std::vector<PointColumn>& computed = {});
// The georeferencing comment lines of a point set ("" when undeclared).
std::string GeorefComments(const PointSet& points);

// Shortest decimal text of a double that reads back to the same value.
std::string FormatDouble(double value);
// Four significant digits, for the summaries the commands print.
std::string FormatShort(double value);

}  // namespace lumo::cli
