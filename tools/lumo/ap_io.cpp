#include "ap_io.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <string>

#include "cli_error.h"
#include "points_io.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

// Largest deviation of R R^T from the identity that still counts as a rotation.
constexpr double kRotationTolerance = 1e-6;

// Where a value is read, for messages: the file and the field under "ap".
struct ApContext {
    const std::string& osSource;

    [[noreturn]] void Fail(const std::string& field, const std::string& problem) const {
        LUMO_CLI_FAIL(osSource + ": field " + Quoted("ap." + field) + " " + problem);
    }
};

double FiniteNumber(const json& item, const std::string& field, const ApContext& ctx) {
    const double number = item.is_number() ? item.get<double>() : std::nan("");
    if (!std::isfinite(number)) ctx.Fail(field, "must be a finite number, found " + item.dump());
    return number;
}

double GetNumber(const json& section, const char* name, const ApContext& ctx) {
    const auto it = section.find(name);
    if (it == section.end()) ctx.Fail(name, "is missing");
    return FiniteNumber(*it, name, ctx);
}

// `count` finite numbers into `target`; an optional array that is absent
// leaves the target as it is (zero after allocation).
void GetArray(const json& section, const char* name, int count, double* target, bool required,
              const ApContext& ctx) {
    const auto it = section.find(name);
    if (it == section.end()) {
        if (required) ctx.Fail(name, "is missing");
        return;
    }
    if (!it->is_array() || it->size() != static_cast<std::size_t>(count)) {
        ctx.Fail(name,
                 "must be an array of " + std::to_string(count) + " numbers, found " + it->dump());
    }
    for (int k = 0; k < count; ++k) {
        target[k] = FiniteNumber((*it)[static_cast<std::size_t>(k)],
                                 std::string(name) + "[" + std::to_string(k) + "]", ctx);
    }
}

int GetFlag(const json& corrections, const char* name, const ApContext& ctx) {
    const auto it = corrections.find(name);
    if (it == corrections.end()) return 0;
    if (!it->is_boolean()) {
        ctx.Fail(std::string("corrections.") + name, "must be true or false, found " + it->dump());
    }
    return it->get<bool>() ? 1 : 0;
}

void GetCorrections(const json& section, APInfo_t& ap, const ApContext& ctx) {
    const auto it = section.find("corrections");
    if (it == section.end()) return;
    if (!it->is_object()) ctx.Fail("corrections", "must be a JSON object, found " + it->dump());
    ap.bPrincipalPoint = GetFlag(*it, "principalPoint", ctx);
    ap.bRadialDistortion = GetFlag(*it, "radialDistortion", ctx);
    ap.bDecentering = GetFlag(*it, "decentering", ctx);
    ap.bEarthCurvature = GetFlag(*it, "earthCurvature", ctx);
    ap.bRefraction = GetFlag(*it, "refraction", ctx);
}

// Largest |(R R^T - I)_ij|: photo to ground uses R^T as the inverse of R.
double RotationDeviation(const double* R) {
    double deviation = 0.0;
    for (int i = 0; i < 3; ++i) {
        for (int j = 0; j < 3; ++j) {
            double dot = 0.0;
            for (int k = 0; k < 3; ++k) dot += R[3 * i + k] * R[3 * j + k];
            deviation = std::max(deviation, std::fabs(dot - (i == j ? 1.0 : 0.0)));
        }
    }
    return deviation;
}

// A text for one of the record's fixed buffers, refused when it would not fit.
void CopyGeosys(const std::string& text, char* buffer, const std::string& where,
                const std::string& source) {
    if (text.size() >= static_cast<std::size_t>(AP_GEOSYS_SIZE)) {
        LUMO_CLI_FAIL(source + ": field " + Quoted(where) + ": " + Quoted(text) +
                      " is longer than " + std::to_string(AP_GEOSYS_SIZE - 1) + " characters");
    }
    std::memcpy(buffer, text.c_str(), text.size() + 1);
}

std::string BufferText(const char* buffer) {
    return buffer ? std::string(buffer, strnlen(buffer, AP_GEOSYS_SIZE - 1)) : std::string();
}

json NumberArray(const double* values, int count, const char* name) {
    json array = json::array();
    for (int k = 0; k < count; ++k) {
        if (!std::isfinite(values[k])) {
            LUMO_CLI_FAIL(std::string("cannot write model: ") + Quoted(name) + " item " +
                          std::to_string(k) + " is not finite");
        }
        array.push_back(values[k]);
    }
    return array;
}

void ValidateGeometry(const APInfo_t& ap, const ApContext& ctx) {
    if (ap.dfFocalLength == 0.0) ctx.Fail("focalLength", "must not be 0");
    const double deviation = RotationDeviation(ap.adfRotation);
    if (deviation > kRotationTolerance) {
        ctx.Fail("rotation", "must be a rotation matrix (R R^T = I to " +
                                 FormatDouble(kRotationTolerance) + "), deviates by " +
                                 FormatDouble(deviation));
    }
    if (ap.bEarthCurvature != 0 && !(ap.dfEarthRadius > 0.0)) {
        ctx.Fail("earthRadius",
                 "must be positive when the Earth curvature correction is on, found " +
                     FormatDouble(ap.dfEarthRadius));
    }
}

}  // namespace

ApPtr ApFromJson(const ModelEnvelope& envelope, const json& section) {
    const ApContext ctx{envelope.osSource};
    ApPtr ap(APAllocate());
    ap->dfFocalLength = GetNumber(section, "focalLength", ctx);
    double camera[3] = {0.0, 0.0, 0.0};
    GetArray(section, "camera", 3, camera, true, ctx);
    ap->dfCameraX = camera[0];
    ap->dfCameraY = camera[1];
    ap->dfCameraZ = camera[2];
    GetArray(section, "rotation", 9, ap->adfRotation, true, ctx);
    GetArray(section, "imageToPhoto", 8, ap->adfImageToPhoto, true, ctx);
    GetArray(section, "photoToImage", 8, ap->adfPhotoToImage, true, ctx);
    double principal[2] = {0.0, 0.0};
    GetArray(section, "principalPoint", 2, principal, false, ctx);
    ap->dfPrincipalX = principal[0];
    ap->dfPrincipalY = principal[1];
    GetArray(section, "radial", 8, ap->adfRadial, false, ctx);
    GetArray(section, "decentering", 4, ap->adfDecentering, false, ctx);
    if (section.contains("earthRadius")) ap->dfEarthRadius = GetNumber(section, "earthRadius", ctx);
    GetCorrections(section, *ap, ctx);
    ValidateGeometry(*ap, ctx);

    CopyGeosys(envelope.osGeosys, ap->pszGeosys, "geosys", envelope.osSource);
    if (const auto it = section.find("conformalGeosys"); it != section.end()) {
        if (!it->is_string()) ctx.Fail("conformalGeosys", "must be a text, found " + it->dump());
        CopyGeosys(it->get<std::string>(), ap->pszConformalGeosys, "ap.conformalGeosys",
                   envelope.osSource);
    }
    EnvelopeToProjInfo(envelope, ap->psProjInfo);
    return ap;
}

std::shared_ptr<void> ReadApRecord(const ModelEnvelope& envelope, const json& section) {
    ApPtr ap = ApFromJson(envelope, section);
    return std::shared_ptr<void>(ap.release(),
                                 [](void* p) { APDeallocate(static_cast<APInfo_t*>(p)); });
}

json ApToJson(const APInfo_t& ap, int nPixels, int nLines) {
    const std::string geosys = BufferText(ap.pszGeosys);
    json document = MakeEnvelope("ap", geosys.c_str(), ap.psProjInfo, nPixels, nLines);
    json section = json::object();
    section["focalLength"] = NumberArray(&ap.dfFocalLength, 1, "focalLength")[0];
    const double camera[3] = {ap.dfCameraX, ap.dfCameraY, ap.dfCameraZ};
    section["camera"] = NumberArray(camera, 3, "camera");
    section["rotation"] = NumberArray(ap.adfRotation, 9, "rotation");
    section["imageToPhoto"] = NumberArray(ap.adfImageToPhoto, 8, "imageToPhoto");
    section["photoToImage"] = NumberArray(ap.adfPhotoToImage, 8, "photoToImage");
    const double principal[2] = {ap.dfPrincipalX, ap.dfPrincipalY};
    section["principalPoint"] = NumberArray(principal, 2, "principalPoint");
    section["radial"] = NumberArray(ap.adfRadial, 8, "radial");
    section["decentering"] = NumberArray(ap.adfDecentering, 4, "decentering");
    section["earthRadius"] = NumberArray(&ap.dfEarthRadius, 1, "earthRadius")[0];
    section["corrections"] = {{"principalPoint", ap.bPrincipalPoint != 0},
                              {"radialDistortion", ap.bRadialDistortion != 0},
                              {"decentering", ap.bDecentering != 0},
                              {"earthCurvature", ap.bEarthCurvature != 0},
                              {"refraction", ap.bRefraction != 0}};
    const std::string conformal = BufferText(ap.pszConformalGeosys);
    if (!conformal.empty()) section["conformalGeosys"] = conformal;
    document["ap"] = std::move(section);
    return document;
}

}  // namespace lumo::cli
