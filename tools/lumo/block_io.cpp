// Reading block project files.
#include "block_io.h"

#include <cmath>
#include <filesystem>
#include <string>

#include "cli_error.h"
#include "lumo_srit.h"
#include "lumo_types.h"
#include "model_io.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

// A member of an object, or null when absent.
const json* Member(const json& object, const char* pszName) {
    const auto it = object.find(pszName);
    return it == object.end() ? nullptr : &*it;
}

std::string Where(const std::string& source, const std::string& field) {
    return source + ": " + field;
}

std::string Text(const json& object, const char* pszName, const std::string& source,
                 const std::string& field) {
    const json* pv = Member(object, pszName);
    if (pv == nullptr || !pv->is_string()) {
        LUMO_CLI_FAIL(Where(source, field + "." + pszName) + " must be a text");
    }
    std::string text = pv->get<std::string>();
    if (text.empty() || text.size() > static_cast<std::size_t>(SRIT_ID_SIZE)) {
        LUMO_CLI_FAIL(Where(source, field + "." + pszName) + " " + Quoted(text) +
                      " must have 1 to " + std::to_string(SRIT_ID_SIZE) + " characters");
    }
    return text;
}

// A finite number; when bOptional, an absent member or null gives the null value.
double Number(const json& object, const char* pszName, const std::string& source,
              const std::string& field, bool bOptional) {
    const json* pv = Member(object, pszName);
    if (bOptional && (pv == nullptr || pv->is_null())) return LUMO_NULL_VALUE;
    if (pv == nullptr || !pv->is_number()) {
        LUMO_CLI_FAIL(Where(source, field + "." + pszName) + " must be a number");
    }
    const double value = pv->get<double>();
    if (!std::isfinite(value)) {
        LUMO_CLI_FAIL(Where(source, field + "." + pszName) + " must be a finite number");
    }
    return value;
}

const json& Array(const json& document, const char* pszName, const std::string& source,
                  bool bOptional) {
    static const json empty = json::array();
    const json* pv = Member(document, pszName);
    if (pv == nullptr && bOptional) return empty;
    if (pv == nullptr || !pv->is_array()) {
        LUMO_CLI_FAIL(Where(source, pszName) + " must be an array");
    }
    return *pv;
}

void RequireObject(const json& value, const std::string& source, const std::string& field) {
    if (!value.is_object()) LUMO_CLI_FAIL(Where(source, field) + " must be an object");
}

}  // namespace

BlockProject BlockProjectFromJson(const json& document, const std::string& source,
                                  const std::string& baseDirectory) {
    RequireObject(document, source, "the document");
    const json* pFormat = Member(document, "format");
    if (pFormat == nullptr || !pFormat->is_string() ||
        pFormat->get<std::string>() != kBlockFormat) {
        LUMO_CLI_FAIL(Where(source, "format") + " must be " + Quoted(kBlockFormat));
    }
    const json* pVersion = Member(document, "version");
    if (pVersion == nullptr || !pVersion->is_number_integer() ||
        pVersion->get<int>() != kBlockFormatVersion) {
        LUMO_CLI_FAIL(Where(source, "version") + " must be " + std::to_string(kBlockFormatVersion));
    }
    BlockProject project;
    project.osSource = source;
    if (const json* pGeosys = Member(document, "geosys")) {
        if (!pGeosys->is_string()) LUMO_CLI_FAIL(Where(source, "geosys") + " must be a text");
        project.osGeosys = pGeosys->get<std::string>();
    }
    const json& images = Array(document, "images", source, false);
    for (std::size_t i = 0; i < images.size(); ++i) {
        const std::string field = "images[" + std::to_string(i) + "]";
        RequireObject(images[i], source, field);
        BlockImage image;
        image.osId = Text(images[i], "id", source, field);
        const json* pSegment = Member(images[i], "segment");
        if (pSegment == nullptr || !pSegment->is_string() || pSegment->get<std::string>().empty()) {
            LUMO_CLI_FAIL(Where(source, field + ".segment") + " must name a segment file");
        }
        std::filesystem::path path(pSegment->get<std::string>());
        if (path.is_relative() && !baseDirectory.empty()) path = baseDirectory / path;
        image.osSegmentPath = path.string();
        project.asImages.push_back(image);
    }
    if (project.asImages.empty() ||
        project.asImages.size() > static_cast<std::size_t>(SRIT_MAX_IMAGES)) {
        LUMO_CLI_FAIL(Where(source, "images") + " must list 1 to " +
                      std::to_string(SRIT_MAX_IMAGES) + " images, found " +
                      std::to_string(project.asImages.size()));
    }
    const json& gcps = Array(document, "gcps", source, false);
    for (std::size_t i = 0; i < gcps.size(); ++i) {
        const std::string field = "gcps[" + std::to_string(i) + "]";
        RequireObject(gcps[i], source, field);
        BlockGcp gcp;
        gcp.osImage = Text(gcps[i], "image", source, field);
        gcp.osPoint = Text(gcps[i], "point", source, field);
        gcp.dfPixel = Number(gcps[i], "pixel", source, field, false);
        gcp.dfLine = Number(gcps[i], "line", source, field, false);
        gcp.dfX = Number(gcps[i], "x", source, field, false);
        gcp.dfY = Number(gcps[i], "y", source, field, false);
        gcp.dfZ = Number(gcps[i], "z", source, field, true);
        gcp.dfSdX = Number(gcps[i], "sdX", source, field, true);
        gcp.dfSdY = Number(gcps[i], "sdY", source, field, true);
        gcp.dfSdZ = Number(gcps[i], "sdZ", source, field, true);
        if (const json* pCheck = Member(gcps[i], "check")) {
            if (!pCheck->is_boolean())
                LUMO_CLI_FAIL(Where(source, field + ".check") + " must be true or false");
            gcp.bCheck = pCheck->get<bool>();
        }
        project.asGcps.push_back(gcp);
    }
    const json& ties = Array(document, "ties", source, true);
    for (std::size_t i = 0; i < ties.size(); ++i) {
        const std::string field = "ties[" + std::to_string(i) + "]";
        RequireObject(ties[i], source, field);
        BlockTie tie;
        tie.osImage = Text(ties[i], "image", source, field);
        tie.osPoint = Text(ties[i], "point", source, field);
        tie.dfPixel = Number(ties[i], "pixel", source, field, false);
        tie.dfLine = Number(ties[i], "line", source, field, false);
        tie.dfZ = Number(ties[i], "z", source, field, true);
        project.asTies.push_back(tie);
    }
    return project;
}

BlockProject ReadBlockProject(const std::string& path) {
    const json document = ParseJsonFile(path);
    return BlockProjectFromJson(document, path, std::filesystem::path(path).parent_path().string());
}

}  // namespace lumo::cli
