#include "rf_io.h"

#include <limits>
#include <string>

#include "cli_error.h"
#include "json_fields.h"
#include "nova/projection.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

constexpr const char* kFamily = "rf";

// Arrays under "rf" say how many items a wrong-length array holds.
const ArrayFormat kRfArray{ArrayWording::kLengthAndSize, ItemWording::kItemWord, ""};

int OptionalInt(const json& section, const char* name, int minimum, int maximum, int fallback,
                const FieldContext& ctx) {
    return section.contains(name) ? GetInt(section, name, minimum, maximum, ctx) : fallback;
}

}  // namespace

RFPtr RFFromJson(const ModelEnvelope& envelope, const json& section) {
    const FieldContext ctx{envelope.osSource, kFamily};
    const int nTerms = GetInt(section, "nTerms", 0, RF_MAX_TERMS, ctx);
    const auto terms = static_cast<std::size_t>(nTerms);
    RFPtr rf(RFAllocate(nullptr, nTerms));
    constexpr int kIntMin = std::numeric_limits<int>::min();
    constexpr int kIntMax = std::numeric_limits<int>::max();
    rf->nHalfPixelShift = OptionalInt(section, "halfPixelShift", 0, 1, 1, ctx);
    rf->nDownsample = OptionalInt(section, "downsample", 1, 999, 1, ctx);
    rf->nExtra1 = OptionalInt(section, "extra1", kIntMin, kIntMax, 0, ctx);
    rf->nExtra2 = OptionalInt(section, "extra2", kIntMin, kIntMax, 0, ctx);
    rf->dfXOffset = GetFiniteNumber(section, "xOffset", ctx);
    rf->dfXScale = GetFiniteNumber(section, "xScale", ctx);
    rf->dfYOffset = GetFiniteNumber(section, "yOffset", ctx);
    rf->dfYScale = GetFiniteNumber(section, "yScale", ctx);
    rf->dfZOffset = GetFiniteNumber(section, "zOffset", ctx);
    rf->dfZScale = GetFiniteNumber(section, "zScale", ctx);
    rf->dfPixelOffset = GetFiniteNumber(section, "pixelOffset", ctx);
    rf->dfPixelScale = GetFiniteNumber(section, "pixelScale", ctx);
    rf->dfLineOffset = GetFiniteNumber(section, "lineOffset", ctx);
    rf->dfLineScale = GetFiniteNumber(section, "lineScale", ctx);
    rf->nAdjust = OptionalInt(section, "adjust", 0, 1, 0, ctx);
    // The adjustment terms are kept when given, in force or not.
    if (rf->nAdjust || section.contains("pixelAdjust") || section.contains("lineAdjust")) {
        GetFiniteArray(section, "pixelAdjust", RF_ADJUST_TERMS, rf->adfPixelAdjust, ctx, kRfArray);
        GetFiniteArray(section, "lineAdjust", RF_ADJUST_TERMS, rf->adfLineAdjust, ctx, kRfArray);
    }
    GetFiniteArray(section, "pixelNum", terms, rf->padfPixelNum, ctx, kRfArray);
    GetFiniteArray(section, "pixelDen", terms, rf->padfPixelDen, ctx, kRfArray);
    GetFiniteArray(section, "lineNum", terms, rf->padfLineNum, ctx, kRfArray);
    GetFiniteArray(section, "lineDen", terms, rf->padfLineDen, ctx, kRfArray);
    // The record's texts hold 16 characters; a longer one is refused rather
    // than cut, as the file should say what the model holds.
    if (const json* sensor = FindField(section, "sensor")) {
        CopyText(TextValue(*sensor, "sensor", ctx), rf->pszSensor, RF_TEXT_SIZE, "sensor", ctx);
    }
    CopyText(envelope.osGeosys, rf->pszGeosys, RF_TEXT_SIZE, "geosys",
             FieldContext{envelope.osSource, ""});
    EnvelopeToProjInfo(envelope, rf->psProjInfo);
    RequireValidRecord(envelope, kFamily, RFValidate(rf.get()));
    return rf;
}

std::vector<LumoRPCField> RPCFieldsFromJson(const ModelEnvelope& envelope, const json& section) {
    const FieldContext ctx{envelope.osSource, kFamily};
    std::vector<LumoRPCField> fields;
    const json* list = FindField(section, "rpcFields");
    if (list == nullptr) return fields;
    if (!list->is_array()) ctx.Fail("rpcFields", "must be an array of {key, value, quoted}");
    for (std::size_t i = 0; i < list->size(); ++i) {
        const FieldContext item{envelope.osSource,
                                ctx.Field("rpcFields[" + std::to_string(i) + "]")};
        const json& field = (*list)[i];
        if (!field.is_object()) item.Fail("", "must be an object {key, value, quoted}");
        fields.push_back({GetText(field, "key", item), GetText(field, "value", item),
                          GetBool(field, "quoted", item)});
    }
    return fields;
}

json RFToJson(const RFInfo_t& rf, int nPixels, int nLines,
              const std::vector<LumoRPCField>& fields) {
    if (rf.nTerms < 0 || rf.nTerms > RF_MAX_TERMS) {
        LUMO_CLI_FAIL("cannot write model: nTerms " + std::to_string(rf.nTerms) +
                      " lies outside 0..20");
    }
    json document = MakeEnvelope(kFamily, BufferText(rf.pszGeosys, RF_TEXT_SIZE - 1).c_str(),
                                 rf.psProjInfo, nPixels, nLines);
    json section = json::object();
    section["nTerms"] = rf.nTerms;
    section["halfPixelShift"] = rf.nHalfPixelShift ? 1 : 0;
    section["downsample"] = rf.nDownsample;
    section["extra1"] = rf.nExtra1;
    section["extra2"] = rf.nExtra2;
    section["sensor"] = BufferText(rf.pszSensor, RF_TEXT_SIZE - 1);
    section["xOffset"] = FiniteForWrite(rf.dfXOffset, "xOffset");
    section["xScale"] = FiniteForWrite(rf.dfXScale, "xScale");
    section["yOffset"] = FiniteForWrite(rf.dfYOffset, "yOffset");
    section["yScale"] = FiniteForWrite(rf.dfYScale, "yScale");
    section["zOffset"] = FiniteForWrite(rf.dfZOffset, "zOffset");
    section["zScale"] = FiniteForWrite(rf.dfZScale, "zScale");
    section["pixelOffset"] = FiniteForWrite(rf.dfPixelOffset, "pixelOffset");
    section["pixelScale"] = FiniteForWrite(rf.dfPixelScale, "pixelScale");
    section["lineOffset"] = FiniteForWrite(rf.dfLineOffset, "lineOffset");
    section["lineScale"] = FiniteForWrite(rf.dfLineScale, "lineScale");
    section["adjust"] = rf.nAdjust ? 1 : 0;
    section["pixelAdjust"] =
        FiniteNumberArray(rf.adfPixelAdjust, RF_ADJUST_TERMS, ItemOf("item", "pixelAdjust"));
    section["lineAdjust"] =
        FiniteNumberArray(rf.adfLineAdjust, RF_ADJUST_TERMS, ItemOf("item", "lineAdjust"));
    section["pixelNum"] = FiniteNumberArray(rf.padfPixelNum, rf.nTerms, ItemOf("item", "pixelNum"));
    section["pixelDen"] = FiniteNumberArray(rf.padfPixelDen, rf.nTerms, ItemOf("item", "pixelDen"));
    section["lineNum"] = FiniteNumberArray(rf.padfLineNum, rf.nTerms, ItemOf("item", "lineNum"));
    section["lineDen"] = FiniteNumberArray(rf.padfLineDen, rf.nTerms, ItemOf("item", "lineDen"));
    if (!fields.empty()) {
        json list = json::array();
        for (const LumoRPCField& field : fields) {
            list.push_back(
                {{"key", field.osKey}, {"value", field.osValue}, {"quoted", field.bQuoted}});
        }
        section["rpcFields"] = std::move(list);
    }
    document[kFamily] = std::move(section);
    return document;
}

std::shared_ptr<void> ShareRFRecord(RFPtr rf) {
    return std::shared_ptr<void>(rf.release(),
                                 [](void* p) { RFDeallocate(static_cast<RFInfo_t*>(p)); });
}

std::shared_ptr<void> ReadRFRecord(const ModelEnvelope& envelope, const json& section) {
    return ShareRFRecord(RFFromJson(envelope, section));
}

}  // namespace lumo::cli
