// Reading block project files.
#include "block_io.h"

#include <cctype>
#include <cmath>
#include <filesystem>
#include <map>
#include <string>

#include "cli_error.h"
#include "json_fields.h"
#include "lumo_srit.h"
#include "lumo_types.h"
#include "model_io.h"
#include "points_io.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

// Largest ground coordinate that can be real: a conformal projection of the
// Earth spans some 4e7 m (and 1.3e8 US survey feet).
constexpr double kMaxGround = 1e9;
// Heights within 100 km of the ellipsoid; image coordinates within 1e9.
constexpr double kMaxHeight = 1e5;
constexpr double kMaxImage = 1e9;
// Two observations of one control point agree when their ground positions
// differ by at most this much in every coordinate (ground units, metres).
constexpr double kSamePointTolerance = 1e-3;

// An identifier of 1 to SRIT_ID_SIZE characters.
std::string Text(const json& object, const char* pszName, const FieldContext& ctx) {
    const json* pv = FindField(object, pszName);
    if (pv == nullptr || !pv->is_string()) ctx.Fail(pszName, "must be a text");
    std::string text = pv->get<std::string>();
    if (text.empty() || text.size() > static_cast<std::size_t>(SRIT_ID_SIZE)) {
        ctx.Fail(pszName,
                 Quoted(text) + " must have 1 to " + std::to_string(SRIT_ID_SIZE) + " characters");
    }
    return text;
}

// A finite number within ±dfLimit; when bOptional, an absent member or null
// gives the null value.
double Number(const json& object, const char* pszName, const FieldContext& ctx, bool bOptional,
              double dfLimit) {
    const json* pv = FindField(object, pszName);
    if (bOptional && (pv == nullptr || pv->is_null())) return LUMO_NULL_VALUE;
    if (pv == nullptr || !pv->is_number()) ctx.Fail(pszName, "must be a number");
    const double value = pv->get<double>();
    if (!std::isfinite(value)) ctx.Fail(pszName, "must be a finite number");
    if (std::fabs(value) > dfLimit) {
        ctx.Fail(pszName, FormatDouble(value) + " is not a physical value (beyond ±" +
                              FormatDouble(dfLimit) + ")");
    }
    return value;
}

// A standard deviation: positive when given.
double Deviation(const json& object, const char* pszName, const FieldContext& ctx) {
    const double value = Number(object, pszName, ctx, true, kMaxGround);
    if (value != LUMO_NULL_VALUE && !(value > 0.0)) {
        ctx.Fail(pszName, "must be positive, found " + FormatDouble(value));
    }
    return value;
}

std::string Upper(std::string text) {
    for (char& c : text) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    return text;
}

bool Agree(double a, double b) {
    if (a == LUMO_NULL_VALUE || b == LUMO_NULL_VALUE) return a == b;
    return std::fabs(a - b) <= kSamePointTolerance;
}

std::string Position(const BlockGcp& g) {
    return "(" + FormatDouble(g.dfX) + ", " + FormatDouble(g.dfY) + ", " +
           (g.dfZ == LUMO_NULL_VALUE ? std::string("no z") : FormatDouble(g.dfZ)) + ")";
}

// The observations of one control point (same identifier, case ignored)
// must give one ground position: the adjustment would otherwise keep the
// last one silently.
void CheckSamePositions(const BlockProject& project, const FieldContext& ctx) {
    std::map<std::string, std::size_t> first;
    for (std::size_t i = 0; i < project.asGcps.size(); ++i) {
        const BlockGcp& g = project.asGcps[i];
        const auto [it, bNew] = first.emplace(Upper(g.osPoint), i);
        if (bNew) continue;
        const BlockGcp& f = project.asGcps[it->second];
        if (Agree(f.dfX, g.dfX) && Agree(f.dfY, g.dfY) && Agree(f.dfZ, g.dfZ)) continue;
        ctx.Fail("gcps[" + std::to_string(i) + "]",
                 "gives control point " + Quoted(g.osPoint) + " the ground position " +
                     Position(g) + ", but gcps[" + std::to_string(it->second) + "] gives " +
                     Position(f) + " (observations of one point must agree to " +
                     FormatDouble(kSamePointTolerance) + ")");
    }
}

const json& Array(const json& document, const char* pszName, const FieldContext& ctx,
                  bool bOptional) {
    static const json empty = json::array();
    const json* pv = FindField(document, pszName);
    if (pv == nullptr && bOptional) return empty;
    if (pv == nullptr || !pv->is_array()) ctx.Fail(pszName, "must be an array");
    return *pv;
}

// The context of item i of a list, which must be an object.
FieldContext ListItem(const json& list, const char* pszList, std::size_t i,
                      const FieldContext& ctx) {
    const std::string field = std::string(pszList) + "[" + std::to_string(i) + "]";
    if (!list[i].is_object()) ctx.Fail(field, "must be an object");
    return ctx.Child(field);
}

}  // namespace

BlockProject BlockProjectFromJson(const json& document, const std::string& source,
                                  const std::string& baseDirectory) {
    // Project messages name a field without the word "field" or quotes:
    // `file: gcps[3].pixel must be a number`.
    const FieldContext ctx{source, "", true};
    if (!document.is_object()) ctx.Fail("the document", "must be an object");
    const json* pFormat = FindField(document, "format");
    if (pFormat == nullptr || !pFormat->is_string() ||
        pFormat->get<std::string>() != kBlockFormat) {
        ctx.Fail("format", "must be " + Quoted(kBlockFormat));
    }
    const json* pVersion = FindField(document, "version");
    if (pVersion == nullptr || !pVersion->is_number_integer() ||
        pVersion->get<int>() != kBlockFormatVersion) {
        ctx.Fail("version", "must be " + std::to_string(kBlockFormatVersion));
    }
    BlockProject project;
    project.osSource = source;
    if (const json* pGeosys = FindField(document, "geosys")) {
        if (!pGeosys->is_string()) ctx.Fail("geosys", "must be a text");
        project.osGeosys = pGeosys->get<std::string>();
    }
    const json& images = Array(document, "images", ctx, false);
    for (std::size_t i = 0; i < images.size(); ++i) {
        const FieldContext item = ListItem(images, "images", i, ctx);
        BlockImage image;
        image.osId = Text(images[i], "id", item);
        const json* pSegment = FindField(images[i], "segment");
        if (pSegment == nullptr || !pSegment->is_string() || pSegment->get<std::string>().empty()) {
            item.Fail("segment", "must name a segment file");
        }
        std::filesystem::path path(pSegment->get<std::string>());
        if (path.is_relative() && !baseDirectory.empty()) path = baseDirectory / path;
        image.osSegmentPath = path.string();
        project.asImages.push_back(image);
    }
    if (project.asImages.empty() ||
        project.asImages.size() > static_cast<std::size_t>(SRIT_MAX_IMAGES)) {
        ctx.Fail("images", "must list 1 to " + std::to_string(SRIT_MAX_IMAGES) + " images, found " +
                               std::to_string(project.asImages.size()));
    }
    const json& gcps = Array(document, "gcps", ctx, false);
    for (std::size_t i = 0; i < gcps.size(); ++i) {
        const FieldContext item = ListItem(gcps, "gcps", i, ctx);
        BlockGcp gcp;
        gcp.osImage = Text(gcps[i], "image", item);
        gcp.osPoint = Text(gcps[i], "point", item);
        gcp.dfPixel = Number(gcps[i], "pixel", item, false, kMaxImage);
        gcp.dfLine = Number(gcps[i], "line", item, false, kMaxImage);
        gcp.dfX = Number(gcps[i], "x", item, false, kMaxGround);
        gcp.dfY = Number(gcps[i], "y", item, false, kMaxGround);
        gcp.dfZ = Number(gcps[i], "z", item, true, kMaxHeight);
        gcp.dfSdX = Deviation(gcps[i], "sdX", item);
        gcp.dfSdY = Deviation(gcps[i], "sdY", item);
        gcp.dfSdZ = Deviation(gcps[i], "sdZ", item);
        if (const json* pCheck = FindField(gcps[i], "check")) {
            if (!pCheck->is_boolean()) item.Fail("check", "must be true or false");
            gcp.bCheck = pCheck->get<bool>();
        }
        project.asGcps.push_back(gcp);
    }
    CheckSamePositions(project, ctx);
    const json& ties = Array(document, "ties", ctx, true);
    for (std::size_t i = 0; i < ties.size(); ++i) {
        const FieldContext item = ListItem(ties, "ties", i, ctx);
        BlockTie tie;
        tie.osImage = Text(ties[i], "image", item);
        tie.osPoint = Text(ties[i], "point", item);
        tie.dfPixel = Number(ties[i], "pixel", item, false, kMaxImage);
        tie.dfLine = Number(ties[i], "line", item, false, kMaxImage);
        tie.dfZ = Number(ties[i], "z", item, true, kMaxHeight);
        project.asTies.push_back(tie);
    }
    return project;
}

BlockProject ReadBlockProject(const std::string& path) {
    const json document = ParseJsonFile(path);
    return BlockProjectFromJson(document, path, std::filesystem::path(path).parent_path().string());
}

}  // namespace lumo::cli
