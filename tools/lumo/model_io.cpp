#include "model_io.h"

#include <cmath>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <limits>
#include <sstream>

#include "ap_io.h"
#include "cli_error.h"
#include "nova/projection.h"
#include "rf_io.h"
#include "srit_io.h"
#include "tps_io.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

// The section of a document being read, for messages: the file and the path
// of the enclosing object ("poly").
struct JsonContext {
    const std::string& osSource;
    std::string osPath;

    std::string Field(const char* name) const {
        return osPath.empty() ? std::string(name) : osPath + "." + name;
    }
    [[noreturn]] void Fail(const char* name, const std::string& problem) const {
        LUMO_CLI_FAIL(osSource + ": field " + Quoted(Field(name)) + " " + problem);
    }
};

const json& RequireField(const json& object, const char* name, const JsonContext& ctx) {
    const auto it = object.find(name);
    if (it == object.end()) ctx.Fail(name, "is missing");
    return *it;
}

std::string GetString(const json& object, const char* name, const JsonContext& ctx) {
    const json& value = RequireField(object, name, ctx);
    if (!value.is_string()) ctx.Fail(name, "must be a text, found " + value.dump());
    return value.get<std::string>();
}

int GetInt(const json& object, const char* name, int minimum, int maximum, const JsonContext& ctx) {
    const json& value = RequireField(object, name, ctx);
    if (!value.is_number_integer()) ctx.Fail(name, "must be an integer, found " + value.dump());
    const bool fitsSigned = !value.is_number_unsigned() ||
                            value.get<std::uint64_t>() <= std::numeric_limits<std::int64_t>::max();
    const std::int64_t n = fitsSigned ? value.get<std::int64_t>() : maximum + std::int64_t{1};
    if (n < minimum || n > maximum) {
        ctx.Fail(name, "must lie in " + std::to_string(minimum) + ".." + std::to_string(maximum) +
                           ", found " + value.dump());
    }
    return static_cast<int>(n);
}

void GetCoefficients(const json& object, const char* name, int count, double* target,
                     const JsonContext& ctx) {
    const json& value = RequireField(object, name, ctx);
    if (!value.is_array()) ctx.Fail(name, "must be an array of numbers, found " + value.dump());
    if (value.size() != static_cast<std::size_t>(count)) {
        ctx.Fail(name, "must hold " + std::to_string(count) + " numbers (nCoeffs), found " +
                           std::to_string(value.size()));
    }
    for (int k = 0; k < count; ++k) {
        const json& item = value[static_cast<std::size_t>(k)];
        const double number = item.is_number() ? item.get<double>() : std::nan("");
        if (!std::isfinite(number)) {
            ctx.Fail(name, "item " + std::to_string(k) + " must be a finite number, found " +
                               item.dump());
        }
        target[k] = number;
    }
}

ModelEnvelope ReadEnvelope(const json& document, const std::string& source) {
    const JsonContext ctx{source, ""};
    if (!document.is_object()) {
        LUMO_CLI_FAIL(source + ": a model file must hold a JSON object");
    }
    const std::string format = GetString(document, "format", ctx);
    if (format != kModelFormat) {
        ctx.Fail("format", "must be " + Quoted(kModelFormat) + ", found " + Quoted(format));
    }
    GetInt(document, "version", kModelFormatVersion, kModelFormatVersion, ctx);
    ModelEnvelope envelope;
    envelope.osSource = source;
    envelope.osFamily = GetString(document, "family", ctx);
    envelope.osGeosys = GetString(document, "geosys", ctx);
    if (document.contains("projParms"))
        envelope.osProjParms = GetString(document, "projParms", ctx);
    envelope.nPixels = GetInt(document, "pixels", 0, std::numeric_limits<int>::max(), ctx);
    envelope.nLines = GetInt(document, "lines", 0, std::numeric_limits<int>::max(), ctx);
    return envelope;
}

std::shared_ptr<void> ReadPolyRecord(const ModelEnvelope& envelope, const json& section) {
    return SharePolyRecord(PolyFromJson(envelope, section));
}

json CoefficientArray(const double* coeffs, int count, const char* name) {
    json array = json::array();
    for (int k = 0; k < count; ++k) {
        if (!std::isfinite(coeffs[k])) {
            LUMO_CLI_FAIL(std::string("cannot write model: coefficient ") + std::to_string(k) +
                          " of " + Quoted(name) + " is not finite");
        }
        array.push_back(coeffs[k]);
    }
    return array;
}

}  // namespace

POLYInfo_t* LoadedModel::AsPoly() const {
    return nModelCode == LUMO_CODE_POLY ? static_cast<POLYInfo_t*>(poRecord.get()) : nullptr;
}

const std::vector<ModelFamilyCodec>& ModelFamilies() {
    static const std::vector<ModelFamilyCodec> families = {
        {"poly", LUMO_CODE_POLY, "polynomial model", &ReadPolyRecord},
        {"rf", LUMO_CODE_RF, "rational function model", &ReadRFRecord},
        {"tps", LUMO_CODE_TPS, "thin plate spline model", &ReadTpsRecord},
        {"ap", LUMO_CODE_AP, "aerial photo model", &ReadApRecord},
        {"srit", LUMO_CODE_SRIT, "satellite rigorous model", &ReadSritRecord},
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
        const JsonContext ctx{source, ""};
        const json& section = RequireField(document, codec.pszFamily, ctx);
        if (!section.is_object()) ctx.Fail(codec.pszFamily, "must be a JSON object");
        model.nModelCode = codec.nModelCode;
        model.poRecord = codec.pfnRead(model.sEnvelope, section);
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

void EnvelopeToProjInfo(const ModelEnvelope& envelope, ProjInfo_t* psProjInfo) {
    if (Geosys2ProjInfo(psProjInfo, envelope.osGeosys.c_str(), 0.0, 0.0, 1.0, 1.0) < 0) {
        LUMO_CLI_FAIL(envelope.osSource + ": field \"geosys\": unknown georeferencing text " +
                      Quoted(envelope.osGeosys));
    }
    if (!envelope.osProjParms.empty() &&
        ProjParms2Info(envelope.osProjParms.c_str(), psProjInfo) != 0) {
        LUMO_CLI_FAIL(envelope.osSource + ": field \"projParms\": cannot apply " +
                      Quoted(envelope.osProjParms));
    }
}

PolyPtr PolyFromJson(const ModelEnvelope& envelope, const json& section) {
    const JsonContext ctx{envelope.osSource, "poly"};
    // The record keeps the text in a fixed buffer; a longer one would be cut.
    if (envelope.osGeosys.size() >= static_cast<std::size_t>(POLY_GEOSYS_SIZE)) {
        LUMO_CLI_FAIL(envelope.osSource + ": field \"geosys\": " + Quoted(envelope.osGeosys) +
                      " is longer than " + std::to_string(POLY_GEOSYS_SIZE - 1) + " characters");
    }
    PolyPtr poly(POLYAllocate());
    poly->nCoeffs = GetInt(section, "nCoeffs", 1, POLY_MAX_COEFFS, ctx);
    poly->nPixels = envelope.nPixels;
    poly->nLines = envelope.nLines;
    GetCoefficients(section, "pixelCoeffs", poly->nCoeffs, poly->padfPixelCoeffs, ctx);
    GetCoefficients(section, "lineCoeffs", poly->nCoeffs, poly->padfLineCoeffs, ctx);
    GetCoefficients(section, "xCoeffs", poly->nCoeffs, poly->padfXCoeffs, ctx);
    GetCoefficients(section, "yCoeffs", poly->nCoeffs, poly->padfYCoeffs, ctx);
    std::memcpy(poly->pszGeosys, envelope.osGeosys.c_str(), envelope.osGeosys.size() + 1);
    EnvelopeToProjInfo(envelope, poly->psProjInfo);
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

json PolyToJson(const POLYInfo_t& poly) {
    if (poly.nCoeffs < 1 || poly.nCoeffs > POLY_MAX_COEFFS) {
        LUMO_CLI_FAIL("cannot write model: nCoeffs " + std::to_string(poly.nCoeffs) +
                      " lies outside 1.." + std::to_string(POLY_MAX_COEFFS));
    }
    // The buffer need not be terminated within its size; never read past it.
    const std::string geosys(poly.pszGeosys, strnlen(poly.pszGeosys, POLY_GEOSYS_SIZE - 1));
    json document =
        MakeEnvelope("poly", geosys.c_str(), poly.psProjInfo, poly.nPixels, poly.nLines);
    json section = json::object();
    section["nCoeffs"] = poly.nCoeffs;
    section["pixelCoeffs"] = CoefficientArray(poly.padfPixelCoeffs, poly.nCoeffs, "pixelCoeffs");
    section["lineCoeffs"] = CoefficientArray(poly.padfLineCoeffs, poly.nCoeffs, "lineCoeffs");
    section["xCoeffs"] = CoefficientArray(poly.padfXCoeffs, poly.nCoeffs, "xCoeffs");
    section["yCoeffs"] = CoefficientArray(poly.padfYCoeffs, poly.nCoeffs, "yCoeffs");
    document["poly"] = std::move(section);
    return document;
}

PolyPtr ReadPolyModelFile(const std::string& path) {
    const json document = ParseJsonFile(path);
    const ModelEnvelope envelope = ReadEnvelope(document, path);
    if (envelope.osFamily != "poly") {
        LUMO_CLI_FAIL(path + ": holds a " + Quoted(envelope.osFamily) +
                      " model, not a polynomial model");
    }
    const JsonContext ctx{path, ""};
    const json& section = RequireField(document, "poly", ctx);
    if (!section.is_object()) ctx.Fail("poly", "must be a JSON object");
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
