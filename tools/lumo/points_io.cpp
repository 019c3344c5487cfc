#include "points_io.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <istream>
#include <optional>
#include <ostream>
#include <sstream>

#include "cli_error.h"

namespace lumo::cli {
namespace {

// The columns a point file is read from.
constexpr std::array<PointColumn, 6> kAllColumns = {PointColumn::Id,   PointColumn::Pixel,
                                                    PointColumn::Line, PointColumn::X,
                                                    PointColumn::Y,    PointColumn::Z};

std::string Trim(const std::string& text) {
    const auto first = text.find_first_not_of(" \t\r");
    if (first == std::string::npos) return "";
    const auto last = text.find_last_not_of(" \t\r");
    return text.substr(first, last - first + 1);
}

std::string Lower(std::string text) {
    std::transform(text.begin(), text.end(), text.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return text;
}

// Fields of a comma-separated line, or of a plain list separated by blanks.
std::vector<std::string> SplitFields(const std::string& line, bool bBlankSeparated) {
    std::vector<std::string> fields;
    if (bBlankSeparated) {
        std::istringstream words(line);
        for (std::string word; words >> word;) fields.push_back(word);
        return fields;
    }
    std::size_t start = 0;
    while (true) {
        const auto comma = line.find(',', start);
        fields.push_back(Trim(line.substr(start, comma - start)));
        if (comma == std::string::npos) break;
        start = comma + 1;
    }
    return fields;
}

bool IsNumber(const std::string& field) {
    const char* begin = field.data();
    const char* end = begin + field.size();
    if (begin != end && *begin == '+') ++begin;
    double value = 0.0;
    const auto result = std::from_chars(begin, end, value);
    return begin != end && result.ec == std::errc() && result.ptr == end;
}

// Text that is not printable is not a point file: say so instead of echoing
// its bytes.
void RequireText(const std::string& line, const std::string& where) {
    for (unsigned char c : line) {
        if (c == '\t' || c == '\r' || c >= 0x20) continue;
        LUMO_CLI_FAIL(where +
                      ": holds binary data, not the text of a point file (CSV with a "
                      "header line naming the columns; see docs/files.md)");
    }
}

bool IsSkippable(const std::string& line) {
    const std::string text = Trim(line);
    return text.empty() || text[0] == '#';
}

// A "# geosys: TEXT" or "# projParms: TEXT" comment ahead of the points
// declares the georeferencing of their ground coordinates; so does the
// "#CRS: WKT" line of a georeferencer's .points file (empty there when the
// georeferencer had none).
void ReadGeorefComment(const std::string& line, const std::string& where, PointSet& set) {
    const std::string text = Trim(line);
    if (text.empty() || text[0] != '#') return;
    const std::string body = Trim(text.substr(1));
    const auto colon = body.find(':');
    if (colon == std::string::npos) return;
    const std::string key = Lower(Trim(body.substr(0, colon)));
    if (key == "crs" && Trim(body.substr(colon + 1)).empty()) return;
    std::string* target = key == "geosys" || key == "crs" ? &set.osGeosys
                          : key == "projparms"            ? &set.osProjParms
                                                          : nullptr;
    if (target == nullptr) return;
    if (!target->empty()) LUMO_CLI_FAIL(where + ": a second " + Quoted(key) + " comment");
    *target = Trim(body.substr(colon + 1));
    if (target->empty()) LUMO_CLI_FAIL(where + ": the " + Quoted(key) + " comment gives no text");
}

std::vector<PointColumn> RequiredColumns(PointKind kind) {
    switch (kind) {
        case PointKind::Ground:
            return {PointColumn::X, PointColumn::Y};
        case PointKind::Image:
            return {PointColumn::Pixel, PointColumn::Line};
        case PointKind::ControlPoint:
            return {PointColumn::Pixel, PointColumn::Line, PointColumn::X, PointColumn::Y};
    }
    return {};
}

// Field index of each recognised column, or nothing when absent.
struct ColumnMap {
    std::array<std::optional<std::size_t>, kAllColumns.size()> aoIndex;
    std::size_t nFields = 0;
    std::vector<std::string> aosNames;
    bool bBlankSeparated = false;  // a plain list: fields separated by blanks
    // A desktop GIS georeferencer's .points file: its image Y grows upwards,
    // so the line is its negative, and points with "enable" 0 are left out.
    bool bGeoreferencer = false;
    std::optional<std::size_t> oEnable;

    std::optional<std::size_t>& operator[](PointColumn c) {
        return aoIndex[static_cast<std::size_t>(c)];
    }
};

// Column names of the georeferencer's .points files (older and newer).
struct ColumnAlias {
    const char* pszName;
    PointColumn eColumn;
};
constexpr ColumnAlias kGeoreferencerColumns[] = {
    {"mapx", PointColumn::X},      {"mapy", PointColumn::Y},        {"pixelx", PointColumn::Pixel},
    {"pixely", PointColumn::Line}, {"sourcex", PointColumn::Pixel}, {"sourcey", PointColumn::Line},
};

void MapColumn(ColumnMap& map, PointColumn c, std::size_t i, const std::string& where) {
    if (map[c]) {
        LUMO_CLI_FAIL(where + ": column " + Quoted(PointColumnName(c)) +
                      " appears twice in the header (as " + Quoted(Shown(map.aosNames[*map[c]])) +
                      " and " + Quoted(Shown(map.aosNames[i])) + ")");
    }
    map[c] = i;
}

ColumnMap ParseHeader(const std::string& line, const std::string& where) {
    ColumnMap map;
    map.bBlankSeparated = line.find(',') == std::string::npos;
    map.aosNames = SplitFields(line, map.bBlankSeparated);
    map.nFields = map.aosNames.size();
    for (std::size_t i = 0; i < map.nFields; ++i) {
        const std::string name = Lower(map.aosNames[i]);
        for (PointColumn c : kAllColumns) {
            if (name == PointColumnName(c)) MapColumn(map, c, i, where);
        }
        for (const ColumnAlias& alias : kGeoreferencerColumns) {
            if (name != alias.pszName) continue;
            MapColumn(map, alias.eColumn, i, where);
            map.bGeoreferencer = true;
        }
        if (name == "enable") map.oEnable = i;
    }
    if (!map.bGeoreferencer) map.oEnable.reset();
    return map;
}

// A plain list without a header: pixel line X Y [Z] on every line.
bool IsHeaderlessList(const std::string& line) {
    if (line.find(',') != std::string::npos) return false;
    const std::vector<std::string> fields = SplitFields(line, true);
    return (fields.size() == 4 || fields.size() == 5) &&
           std::all_of(fields.begin(), fields.end(), IsNumber);
}

ColumnMap HeaderlessColumns(const std::string& line) {
    ColumnMap map;
    map.bBlankSeparated = true;
    map.nFields = SplitFields(line, true).size();
    const PointColumn order[] = {PointColumn::Pixel, PointColumn::Line, PointColumn::X,
                                 PointColumn::Y, PointColumn::Z};
    for (std::size_t i = 0; i < map.nFields; ++i) {
        map[order[i]] = i;
        map.aosNames.push_back(PointColumnName(order[i]));
    }
    return map;
}

void RequireColumns(ColumnMap& map, PointKind kind, const std::string& where) {
    for (PointColumn c : RequiredColumns(kind)) {
        if (map[c]) continue;
        std::string message =
            where + ": missing column " + Quoted(PointColumnName(c)) + " (header has: ";
        for (std::size_t i = 0; i < map.aosNames.size(); ++i) {
            if (i) message += ", ";
            message += Shown(map.aosNames[i]);
        }
        message += ")";
        LUMO_CLI_FAIL(message);
    }
}

double ParseNumber(const std::string& field, const std::string& where, std::size_t column,
                   const std::string& name) {
    const char* begin = field.data();
    const char* end = begin + field.size();
    if (begin != end && *begin == '+') ++begin;
    double value = 0.0;
    const auto result = std::from_chars(begin, end, value);
    const bool whole = result.ec == std::errc() && result.ptr == end && begin != end;
    if (!whole || !std::isfinite(value)) {
        LUMO_CLI_FAIL(where + ": column " + std::to_string(column + 1) + " (" + Quoted(name) +
                      "): " + Quoted(Shown(field)) + " is not a finite number");
    }
    return value;
}

PointRecord ParseRow(const std::vector<std::string>& fields, ColumnMap& map,
                     const std::string& where) {
    PointRecord point;
    const auto number = [&](PointColumn c, double* target) {
        if (!map[c]) return;
        const std::size_t i = *map[c];
        *target = ParseNumber(fields[i], where, i, map.aosNames[i]);
    };
    number(PointColumn::Pixel, &point.dfPixel);
    number(PointColumn::Line, &point.dfLine);
    number(PointColumn::X, &point.dfX);
    number(PointColumn::Y, &point.dfY);
    number(PointColumn::Z, &point.dfZ);
    if (map.bGeoreferencer) point.dfLine = -point.dfLine;
    if (map[PointColumn::Id]) point.osId = fields[*map[PointColumn::Id]];
    return point;
}

double ColumnValue(const PointRecord& p, PointColumn c) {
    switch (c) {
        case PointColumn::Pixel:
            return p.dfPixel;
        case PointColumn::Line:
            return p.dfLine;
        case PointColumn::X:
            return p.dfX;
        case PointColumn::Y:
            return p.dfY;
        case PointColumn::Z:
        case PointColumn::Id:
        case PointColumn::Status:
            break;
    }
    return p.dfZ;
}

}  // namespace

const char* PointColumnName(PointColumn column) {
    switch (column) {
        case PointColumn::Id:
            return "id";
        case PointColumn::Pixel:
            return "pixel";
        case PointColumn::Line:
            return "line";
        case PointColumn::X:
            return "x";
        case PointColumn::Y:
            return "y";
        case PointColumn::Z:
            return "z";
        case PointColumn::Status:
            return "status";
    }
    return "";
}

PointSet ReadPoints(std::istream& in, const std::string& source, PointKind kind) {
    PointSet set;
    set.osSource = source;
    std::string line;
    int lineNumber = 0;
    std::optional<ColumnMap> header;
    while (std::getline(in, line)) {
        ++lineNumber;
        const std::string where = source + ":" + std::to_string(lineNumber);
        RequireText(line, where);
        if (IsSkippable(line)) {
            if (set.asPoints.empty()) ReadGeorefComment(line, where, set);
            continue;
        }
        const bool bHeaderless =
            !header && kind == PointKind::ControlPoint && IsHeaderlessList(line);
        if (!header) {
            header = bHeaderless ? HeaderlessColumns(line) : ParseHeader(line, where);
            RequireColumns(*header, kind, where);
            set.bHasId = (*header)[PointColumn::Id].has_value();
            set.bHasZ = (*header)[PointColumn::Z].has_value();
            if (!bHeaderless) continue;
        }
        const std::vector<std::string> fields = SplitFields(line, header->bBlankSeparated);
        if (fields.size() != header->nFields) {
            LUMO_CLI_FAIL(where + ": expected " + std::to_string(header->nFields) +
                          " fields as in the header, found " + std::to_string(fields.size()));
        }
        if (header->oEnable && Trim(fields[*header->oEnable]) == "0") {
            ++set.nDisabled;
            continue;
        }
        set.asPoints.push_back(ParseRow(fields, *header, where));
        set.asPoints.back().nSourceLine = lineNumber;
    }
    if (in.bad()) LUMO_CLI_FAIL(source + ": read error");
    if (!header) {
        LUMO_CLI_FAIL(source + ": empty file, expected a header line naming the columns");
    }
    return set;
}

void NoteDisabledPoints(const PointSet& points, const std::string& command, std::ostream& err) {
    if (points.nDisabled == 0) return;
    err << command << ": " << points.osSource << ": " << points.nDisabled
        << (points.nDisabled == 1 ? " point is" : " points are")
        << " not enabled (enable = 0) and left out\n";
}

PointSet ReadPointsFile(const std::string& path, PointKind kind) {
    std::ifstream in(path);
    if (!in) LUMO_CLI_FAIL(path + ": cannot open point file");
    return ReadPoints(in, path, kind);
}

std::string FormatDouble(double value) {
    std::array<char, 32> buffer{};
    const auto result = std::to_chars(buffer.data(), buffer.data() + buffer.size(), value);
    return std::string(buffer.data(), result.ptr);
}

std::string FormatShort(double value) {
    std::array<char, 32> buffer{};
    std::snprintf(buffer.data(), buffer.size(), "%.4g", value);
    return buffer.data();
}

std::string GeorefComments(const PointSet& points) {
    std::string text;
    if (!points.osGeosys.empty()) text += "# geosys: " + points.osGeosys + "\n";
    if (!points.osProjParms.empty()) text += "# projParms: " + points.osProjParms + "\n";
    return text;
}

void WritePoints(std::ostream& out, const PointSet& points, const std::vector<PointColumn>& columns,
                 const std::vector<PointColumn>& computed) {
    out << GeorefComments(points);
    for (std::size_t i = 0; i < columns.size(); ++i) {
        out << (i ? "," : "") << PointColumnName(columns[i]);
    }
    out << '\n';
    for (const PointRecord& p : points.asPoints) {
        for (std::size_t i = 0; i < columns.size(); ++i) {
            if (i) out << ',';
            const bool bEmpty = p.Failed() && std::find(computed.begin(), computed.end(),
                                                        columns[i]) != computed.end();
            if (bEmpty) continue;
            if (columns[i] == PointColumn::Id) {
                out << p.osId;
            } else if (columns[i] == PointColumn::Status) {
                out << p.osStatus;
            } else {
                out << FormatDouble(ColumnValue(p, columns[i]));
            }
        }
        out << '\n';
    }
}

}  // namespace lumo::cli
