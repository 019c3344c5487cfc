#include "ap_io.h"

#include <algorithm>
#include <cmath>
#include <string>

#include "cli_error.h"
#include "json_fields.h"
#include "points_io.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

// Arrays under "ap" name a bad item by its index in the field.
const ArrayFormat kApArray{ArrayWording::kLengthAndValue, ItemWording::kIndexedField, ""};

// `count` finite numbers into `target`; an array that is absent leaves the
// target as it is (zero after allocation).
void GetOptionalArray(const json& section, const char* name, int count, double* target,
                      const FieldContext& ctx) {
    if (const json* value = FindField(section, name)) {
        ReadFiniteArray(*value, name, static_cast<std::size_t>(count), target, ctx, kApArray);
    }
}

int GetFlag(const json& corrections, const char* name, const FieldContext& ctx) {
    const json* value = FindField(corrections, name);
    return value != nullptr && BoolValue(*value, name, ctx) ? 1 : 0;
}

void GetCorrections(const json& section, APInfo_t& ap, const FieldContext& ctx) {
    const json* corrections = FindField(section, "corrections");
    if (corrections == nullptr) return;
    if (!corrections->is_object()) {
        ctx.Fail("corrections", "must be a JSON object, found " + corrections->dump());
    }
    const FieldContext flags = ctx.Child("corrections");
    ap.bPrincipalPoint = GetFlag(*corrections, "principalPoint", flags);
    ap.bRadialDistortion = GetFlag(*corrections, "radialDistortion", flags);
    ap.bDecentering = GetFlag(*corrections, "decentering", flags);
    ap.bEarthCurvature = GetFlag(*corrections, "earthCurvature", flags);
    ap.bRefraction = GetFlag(*corrections, "refraction", flags);
}

// Names item k of a written array as `"name" item k`.
ItemLabel ApItem(const char* name) {
    return ItemLabel{Quoted(name) + " item ", ""};
}

}  // namespace

ApPtr ApFromJson(const ModelEnvelope& envelope, const json& section) {
    const FieldContext ctx{envelope.osSource, "ap"};
    ApPtr ap(APAllocate());
    ap->dfFocalLength = GetFiniteNumber(section, "focalLength", ctx);
    double camera[3] = {0.0, 0.0, 0.0};
    GetFiniteArray(section, "camera", 3, camera, ctx, kApArray);
    ap->dfCameraX = camera[0];
    ap->dfCameraY = camera[1];
    ap->dfCameraZ = camera[2];
    GetFiniteArray(section, "rotation", 9, ap->adfRotation, ctx, kApArray);
    GetFiniteArray(section, "imageToPhoto", 8, ap->adfImageToPhoto, ctx, kApArray);
    GetFiniteArray(section, "photoToImage", 8, ap->adfPhotoToImage, ctx, kApArray);
    double principal[2] = {0.0, 0.0};
    GetOptionalArray(section, "principalPoint", 2, principal, ctx);
    ap->dfPrincipalX = principal[0];
    ap->dfPrincipalY = principal[1];
    GetOptionalArray(section, "radial", 8, ap->adfRadial, ctx);
    GetOptionalArray(section, "decentering", 4, ap->adfDecentering, ctx);
    if (section.contains("earthRadius")) {
        ap->dfEarthRadius = GetFiniteNumber(section, "earthRadius", ctx);
    }
    GetCorrections(section, *ap, ctx);

    CopyText(envelope.osGeosys, ap->pszGeosys, AP_GEOSYS_SIZE, "geosys",
             FieldContext{envelope.osSource, ""});
    if (const json* conformal = FindField(section, "conformalGeosys")) {
        CopyText(TextValue(*conformal, "conformalGeosys", ctx), ap->pszConformalGeosys,
                 AP_GEOSYS_SIZE, "conformalGeosys", ctx);
    }
    EnvelopeToProjInfo(envelope, ap->psProjInfo);
    RequireValidRecord(envelope, "ap", APValidate(ap.get()));
    return ap;
}

std::shared_ptr<void> ReadApRecord(const ModelEnvelope& envelope, const json& section) {
    ApPtr ap = ApFromJson(envelope, section);
    return std::shared_ptr<void>(ap.release(),
                                 [](void* p) { APDeallocate(static_cast<APInfo_t*>(p)); });
}

json ApToJson(const APInfo_t& ap, int nPixels, int nLines) {
    const std::string geosys = BufferText(ap.pszGeosys, AP_GEOSYS_SIZE - 1);
    json document = MakeEnvelope("ap", geosys.c_str(), ap.psProjInfo, nPixels, nLines);
    json section = json::object();
    section["focalLength"] = FiniteNumberArray(&ap.dfFocalLength, 1, ApItem("focalLength"))[0];
    const double camera[3] = {ap.dfCameraX, ap.dfCameraY, ap.dfCameraZ};
    section["camera"] = FiniteNumberArray(camera, 3, ApItem("camera"));
    section["rotation"] = FiniteNumberArray(ap.adfRotation, 9, ApItem("rotation"));
    section["imageToPhoto"] = FiniteNumberArray(ap.adfImageToPhoto, 8, ApItem("imageToPhoto"));
    section["photoToImage"] = FiniteNumberArray(ap.adfPhotoToImage, 8, ApItem("photoToImage"));
    const double principal[2] = {ap.dfPrincipalX, ap.dfPrincipalY};
    section["principalPoint"] = FiniteNumberArray(principal, 2, ApItem("principalPoint"));
    section["radial"] = FiniteNumberArray(ap.adfRadial, 8, ApItem("radial"));
    section["decentering"] = FiniteNumberArray(ap.adfDecentering, 4, ApItem("decentering"));
    section["earthRadius"] = FiniteNumberArray(&ap.dfEarthRadius, 1, ApItem("earthRadius"))[0];
    section["corrections"] = {{"principalPoint", ap.bPrincipalPoint != 0},
                              {"radialDistortion", ap.bRadialDistortion != 0},
                              {"decentering", ap.bDecentering != 0},
                              {"earthCurvature", ap.bEarthCurvature != 0},
                              {"refraction", ap.bRefraction != 0}};
    const std::string conformal = BufferText(ap.pszConformalGeosys, AP_GEOSYS_SIZE - 1);
    if (!conformal.empty()) section["conformalGeosys"] = conformal;
    document["ap"] = std::move(section);
    return document;
}

}  // namespace lumo::cli
