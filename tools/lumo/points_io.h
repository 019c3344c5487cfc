// Point files: comma-separated text with a header line naming the columns.
// One reader serves ground points, image points and control points.
#pragma once

#include <iosfwd>
#include <string>
#include <vector>

namespace lumo::cli {

// Which coordinates a point file must carry.
enum class PointKind {
    Ground,        // x, y; z optional
    Image,         // pixel, line; z optional
    ControlPoint,  // pixel, line, x, y; z optional
};

// Columns the reader recognises and the writer can emit.
enum class PointColumn { Id, Pixel, Line, X, Y, Z };

struct PointRecord {
    std::string osId;  // empty when the file has no id column
    double dfPixel = 0.0;
    double dfLine = 0.0;
    double dfX = 0.0;
    double dfY = 0.0;
    double dfZ = 0.0;     // 0 when the file has no z column
    int nSourceLine = 0;  // line of the file the point came from, counted from 1
};

struct PointSet {
    std::string osSource;  // file name used in messages
    bool bHasId = false;
    bool bHasZ = false;
    std::vector<PointRecord> asPoints;
};

// Name of a column as it appears in a header.
const char* PointColumnName(PointColumn column);

// Reads a point file. Column names are matched without regard to case and
// surrounding blanks; unknown columns are ignored; lines whose first non-blank
// character is '#' and blank lines are skipped. Throws nova::DataException
// naming the source (and line and column) for a missing header, a missing or
// repeated column, a line with the wrong number of fields and a value that is
// not a finite number.
PointSet ReadPoints(std::istream& in, const std::string& source, PointKind kind);
PointSet ReadPointsFile(const std::string& path, PointKind kind);

// Writes the header and one line per point with the given columns. Numbers
// are written in the shortest form that reads back to the same double.
void WritePoints(std::ostream& out, const PointSet& points,
                 const std::vector<PointColumn>& columns);

// Shortest decimal text of a double that reads back to the same value.
std::string FormatDouble(double value);

}  // namespace lumo::cli
