#include "model_io.h"

#include <cstdio>
#include <fstream>
#include <limits>
#include <sstream>

#include "ap_io.h"
#include "cli_error.h"
#include "geosys_option.h"
#include "json_fields.h"
#include "lrs_io.h"
#include "nova/projection.h"
#include "rf_io.h"
#include "rtcs_io.h"
#include "srit_io.h"
#include "tps_io.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

ModelEnvelope ReadEnvelope(const json& document, const std::string& source) {
    const FieldContext ctx{source, ""};
    if (!document.is_object()) {
        LUMO_CLI_FAIL(source + ": a model file must hold a JSON object");
    }
    const std::string format = GetText(document, "format", ctx);
    if (format != kModelFormat) {
        ctx.Fail("format", "must be " + Quoted(kModelFormat) + ", found " + Quoted(format));
    }
    GetInt(document, "version", kModelFormatVersion, kModelFormatVersion, ctx);
    ModelEnvelope envelope;
    envelope.osSource = source;
    envelope.osFamily = GetText(document, "family", ctx);
    envelope.osGeosys = GetText(document, "geosys", ctx);
    if (document.contains("projParms")) envelope.osProjParms = GetText(document, "projParms", ctx);
    envelope.nPixels = GetInt(document, "pixels", 0, std::numeric_limits<int>::max(), ctx);
    envelope.nLines = GetInt(document, "lines", 0, std::numeric_limits<int>::max(), ctx);
    return envelope;
}

// Refuses a model file of another family than the one a command needs.
void RequireFamily(const ModelEnvelope& envelope, const char* pszFamily) {
    if (envelope.osFamily == pszFamily) return;
    std::string wanted = Quoted(pszFamily) + " model";
    for (const ModelFamilyCodec& codec : ModelFamilies()) {
        if (std::string(codec.pszFamily) == pszFamily) wanted = codec.pszDescription;
    }
    LUMO_CLI_FAIL(envelope.osSource + ": holds a " + Quoted(envelope.osFamily) + " model, not a " +
                  wanted);
}

std::shared_ptr<void> ReadPolyRecord(const ModelEnvelope& envelope, const json& section) {
    return SharePolyRecord(PolyFromJson(envelope, section));
}

}  // namespace

POLYInfo_t* LoadedModel::AsPoly() const {
    return nModelCode == LUMO_CODE_POLY ? static_cast<POLYInfo_t*>(poRecord.get()) : nullptr;
}

int LoadedModel::GroundToImage(double x, double y, double z, double* pixel, double* line) const {
    if (poPolyFit) return GCPTransform(&poPolyFit->sGeoToImage, x, y, pixel, line) == 0 ? 1 : 0;
    return GenGeo2Img(nModelCode, poRecord.get(), x, y, z, pixel, line);
}

int LoadedModel::ImageToGround(double pixel, double line, double z, double* x, double* y) const {
    if (poPolyFit) return GCPTransform(&poPolyFit->sImageToGeo, pixel, line, x, y) == 0 ? 1 : 0;
    return GenImg2Geo(nModelCode, poRecord.get(), pixel, line, z, x, y);
}

const std::vector<ModelFamilyCodec>& ModelFamilies() {
    static const std::vector<ModelFamilyCodec> families = {
        {"poly", LUMO_CODE_POLY, "polynomial model", &ReadPolyRecord},
        {"rf", LUMO_CODE_RF, "rational function model", &ReadRFRecord},
        {"tps", LUMO_CODE_TPS, "thin plate spline model", &ReadTpsRecord},
        {"ap", LUMO_CODE_AP, "aerial photo model", &ReadApRecord},
        {"srit", LUMO_CODE_SRIT, "satellite rigorous model", &ReadSritRecord},
        {"rtcs", LUMO_CODE_RTCS, "radar model", &ReadRtcsRecord},
        {"lrs", LUMO_CODE_LRS, "low-resolution orbit model", &ReadLrsRecord},
    };
    return families;
}

json ParseJsonFile(const std::string& path) {
    std::ifstream in(path);
    if (!in) LUMO_CLI_FAIL(path + ": cannot open model file");
    try {
        return json::parse(in);
    } catch (const json::parse_error& e) {
        LUMO_CLI_FAIL(path + ": not valid JSON: " + e.what());
    }
}

LoadedModel ReadModel(const json& document, const std::string& source) {
    LoadedModel model;
    model.sEnvelope = ReadEnvelope(document, source);
    for (const ModelFamilyCodec& codec : ModelFamilies()) {
        if (model.sEnvelope.osFamily != codec.pszFamily) continue;
        const FieldContext ctx{source, ""};
        const json& section = RequireObjectField(document, codec.pszFamily, ctx);
        model.nModelCode = codec.nModelCode;
        model.poRecord = codec.pfnRead(model.sEnvelope, section);
        if (codec.nModelCode == LUMO_CODE_POLY) {
            model.poPolyFit = PolyFitFromJson(model.sEnvelope, section);
        }
        return model;
    }
    std::string known;
    for (const ModelFamilyCodec& codec : ModelFamilies()) {
        known += (known.empty() ? "" : ", ") + Quoted(codec.pszFamily);
    }
    LUMO_CLI_FAIL(source + ": field \"family\": unknown model family " +
                  Quoted(model.sEnvelope.osFamily) + " (known: " + known + ")");
}

LoadedModel ReadModelFile(const std::string& path) {
    return ReadModel(ParseJsonFile(path), path);
}

LoadedModel ReadModelFileOf(const std::string& path, const char* pszFamily) {
    const json document = ParseJsonFile(path);
    RequireFamily(ReadEnvelope(document, path), pszFamily);
    return ReadModel(document, path);
}

void RequireValidRecord(const ModelEnvelope& envelope, const char* pszFamily,
                        const std::string& problem) {
    if (problem.empty()) return;
    LUMO_CLI_FAIL(envelope.osSource + ": field " + Quoted(pszFamily) +
                  ": the model cannot be evaluated: " + problem);
}

void EnvelopeToProjInfo(const ModelEnvelope& envelope, ProjInfo_t* psProjInfo) {
    *psProjInfo = UserGeosys(envelope.osGeosys, envelope.osSource + ": field \"geosys\"");
    if (!envelope.osProjParms.empty() &&
        ProjParms2Info(envelope.osProjParms.c_str(), psProjInfo) != 0) {
        LUMO_CLI_FAIL(envelope.osSource + ": field \"projParms\": cannot apply " +
                      Quoted(envelope.osProjParms));
    }
}

PolyPtr PolyFromJson(const ModelEnvelope& envelope, const json& section) {
    const FieldContext ctx{envelope.osSource, "poly"};
    PolyPtr poly(POLYAllocate());
    // The record keeps the text in a fixed buffer; a longer one would be cut.
    CopyText(envelope.osGeosys, poly->pszGeosys, POLY_GEOSYS_SIZE, "geosys",
             FieldContext{envelope.osSource, ""});
    poly->nCoeffs = GetInt(section, "nCoeffs", 1, POLY_MAX_COEFFS, ctx);
    poly->nPixels = envelope.nPixels;
    poly->nLines = envelope.nLines;
    const auto count = static_cast<std::size_t>(poly->nCoeffs);
    const ArrayFormat format{ArrayWording::kTypeThenLength, ItemWording::kItemWord, " (nCoeffs)"};
    GetFiniteArray(section, "pixelCoeffs", count, poly->padfPixelCoeffs, ctx, format);
    GetFiniteArray(section, "lineCoeffs", count, poly->padfLineCoeffs, ctx, format);
    GetFiniteArray(section, "xCoeffs", count, poly->padfXCoeffs, ctx, format);
    GetFiniteArray(section, "yCoeffs", count, poly->padfYCoeffs, ctx, format);
    EnvelopeToProjInfo(envelope, poly->psProjInfo);
    RequireValidRecord(envelope, "poly", POLYValidate(poly.get()));
    return poly;
}

json MakeEnvelope(const char* pszFamily, const char* pszGeosys, const ProjInfo_t* psProjInfo,
                  int nPixels, int nLines) {
    json document = json::object();
    document["format"] = kModelFormat;
    document["version"] = kModelFormatVersion;
    document["family"] = pszFamily;
    document["geosys"] = pszGeosys;
    if (psProjInfo != nullptr && RequiresProjInfo(DecodeGeosys(pszGeosys, nullptr))) {
        std::unique_ptr<char, nova::FreeDeleter> parms(ProjInfo2Parms(psProjInfo));
        if (parms) document["projParms"] = parms.get();
    }
    document["pixels"] = nPixels;
    document["lines"] = nLines;
    return document;
}

json PolyToJson(const POLYInfo_t& poly, const PolyFit* psFit) {
    if (poly.nCoeffs < 1 || poly.nCoeffs > POLY_MAX_COEFFS) {
        LUMO_CLI_FAIL("cannot write model: nCoeffs " + std::to_string(poly.nCoeffs) +
                      " lies outside 1.." + std::to_string(POLY_MAX_COEFFS));
    }
    const std::string geosys = BufferText(poly.pszGeosys, POLY_GEOSYS_SIZE - 1);
    json document =
        MakeEnvelope("poly", geosys.c_str(), poly.psProjInfo, poly.nPixels, poly.nLines);
    json section = json::object();
    section["nCoeffs"] = poly.nCoeffs;
    section["pixelCoeffs"] =
        FiniteNumberArray(poly.padfPixelCoeffs, poly.nCoeffs, ItemOf("coefficient", "pixelCoeffs"));
    section["lineCoeffs"] =
        FiniteNumberArray(poly.padfLineCoeffs, poly.nCoeffs, ItemOf("coefficient", "lineCoeffs"));
    section["xCoeffs"] =
        FiniteNumberArray(poly.padfXCoeffs, poly.nCoeffs, ItemOf("coefficient", "xCoeffs"));
    section["yCoeffs"] =
        FiniteNumberArray(poly.padfYCoeffs, poly.nCoeffs, ItemOf("coefficient", "yCoeffs"));
    if (psFit != nullptr) section["fit"] = PolyFitToJson(*psFit);
    document["poly"] = std::move(section);
    return document;
}

PolyPtr ReadPolyModelFile(const std::string& path) {
    const json document = ParseJsonFile(path);
    const ModelEnvelope envelope = ReadEnvelope(document, path);
    RequireFamily(envelope, "poly");
    const FieldContext ctx{path, ""};
    const json& section = RequireObjectField(document, "poly", ctx);
    return PolyFromJson(envelope, section);
}

std::shared_ptr<void> SharePolyRecord(PolyPtr poly) {
    // shared_ptr releases the record itself should its own allocation fail.
    return std::shared_ptr<void>(poly.release(),
                                 [](void* p) { POLYDeallocate(static_cast<POLYInfo_t*>(p)); });
}

void WriteFileReplacing(const std::string& path, const std::string& contents) {
    const std::string temporary = path + ".tmp";
    {
        std::ofstream out(temporary, std::ios::binary | std::ios::trunc);
        if (!out) LUMO_CLI_FAIL(temporary + ": cannot create file");
        out << contents;
        out.close();
        if (!out) {
            std::remove(temporary.c_str());
            LUMO_CLI_FAIL(temporary + ": write failed");
        }
    }
    if (std::rename(temporary.c_str(), path.c_str()) != 0) {
        std::remove(temporary.c_str());
        LUMO_CLI_FAIL(path + ": cannot replace file");
    }
}

void WriteModelFile(const std::string& path, const json& document) {
    WriteFileReplacing(path, document.dump(2) + "\n");
}

}  // namespace lumo::cli
