#include "srit_io.h"

#include <algorithm>
#include <cctype>
#include <cstdint>
#include <cstdlib>
#include <string>

#include "cli_error.h"
#include "json_fields.h"
#include "segment_io.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

// An integer in nMin..nMax; one message covers a wrong type and a wrong value.
int ReadInt(const json& section, const char* pszName, int nMin, int nMax, const FieldContext& ctx) {
    const json& value = RequireField(section, pszName, ctx);
    std::int64_t n = 0;
    if (!IntegerInRange(value, nMin, nMax, &n)) {
        ctx.Fail(pszName, "must be an integer in " + std::to_string(nMin) + ".." +
                              std::to_string(nMax) + ", found " + value.dump());
    }
    return static_cast<int>(n);
}

// A fixed text field of the record: at most nSize - 1 characters unless
// bMayFill, in which case all nSize may be used (no terminator).
void ReadText(const json& section, const char* pszName, char* pszTarget, std::size_t nSize,
              bool bMayFill, const FieldContext& ctx) {
    const json* value = FindField(section, pszName);
    if (value == nullptr) return;  // optional: stays empty
    const std::string text = TextValue(*value, pszName, ctx);
    if (text.size() > (bMayFill ? nSize : nSize - 1)) {
        ctx.Fail(pszName, Quoted(text) + " is longer than the record holds");
    }
    std::copy(text.begin(), text.end(), pszTarget);  // the field is zero-filled
}

// Per-line arrays of the record, as a computation leaves them: the columns of
// a "PLA"/"MLA" segment's attitude table.
void FillLineArrays(SRITInfo_t& model) {
    const EphemerisSeg_t* psSeg = model.psEphemeris;
    if (psSeg == nullptr || psSeg->nOrbitType != EPH_ORBIT_ATTITUDE ||
        psSeg->ppOrbitData == nullptr) {
        return;
    }
    const char* pszName = psSeg->szSensorName;
    const bool bLineSensor = (std::toupper(static_cast<unsigned char>(pszName[0])) == 'P' ||
                              std::toupper(static_cast<unsigned char>(pszName[0])) == 'M') &&
                             std::toupper(static_cast<unsigned char>(pszName[1])) == 'L' &&
                             std::toupper(static_cast<unsigned char>(pszName[2])) == 'A';
    const auto* psTable = static_cast<const AttitudeData_t*>(*psSeg->ppOrbitData);
    if (!bLineSensor || psTable == nullptr || psTable->pAttitudeLines == nullptr ||
        psTable->nNumAttitudeLines < 1) {
        return;
    }
    const auto n = static_cast<std::size_t>(psTable->nNumAttitudeLines);
    model.padfLineShiftA = static_cast<double*>(HMalloc(n * sizeof(double)));
    model.padfLineShiftB = static_cast<double*>(HMalloc(n * sizeof(double)));
    for (std::size_t i = 0; i < n; ++i) {
        model.padfLineShiftA[i] = psTable->pAttitudeLines[i].dfValue1;
        model.padfLineShiftB[i] = psTable->pAttitudeLines[i].dfValue2;
    }
}

}  // namespace

const char* FormWord(int32_t nForm) {
    if (nForm == SRIT_FORM_CLASSIC) return "classic";
    return nForm == SRIT_FORM_CURVED_INCIDENCE ? "curved" : nullptr;
}

int32_t FormOfWord(const std::string& word) {
    if (word == "classic") return SRIT_FORM_CLASSIC;
    if (word == "curved") return SRIT_FORM_CURVED_INCIDENCE;
    return -1;
}

SritPtr SritFromJson(const ModelEnvelope& envelope, const json& section) {
    if (!section.is_object()) LUMO_CLI_FAIL(envelope.osSource + ": \"srit\" must be an object");
    const FieldContext ctx{envelope.osSource, "srit"};
    SritPtr model(SRITAllocate());
    GetFiniteArray(section, "coefficients", SRIT_NUM_COEFS, model->adfCoef, ctx,
                   ArrayFormat{ArrayWording::kLengthOnly, ItemWording::kItemWord, ""});
    model->nSensor = ReadInt(section, "sensorCode", 0, 186, ctx);
    model->nModelClass = ReadInt(section, "modelClass", -999, 6, ctx);
    model->anAux[0] = ReadInt(section, "downsample", 0, 1 << 20, ctx);
    if (const json* form = FindField(section, "elevationScale")) {
        const std::string word = TextValue(*form, "elevationScale", ctx);
        model->anAux[SRIT_AUX_FORM] = FormOfWord(word);
        if (model->anAux[SRIT_AUX_FORM] < 0) {
            ctx.Fail("elevationScale", "must be \"classic\" or \"curved\", found " + Quoted(word));
        }
    }
    ReadText(section, "sensor", model->Sensor, SRIT_SENSOR_SIZE, true, ctx);
    ReadText(section, "workingGeosys", model->szAuxA, SRIT_AUX_TEXT_SIZE, false, ctx);
    ReadText(section, "groundGeosys", model->szAuxB, SRIT_AUX_TEXT_SIZE, false, ctx);
    const json& segment = RequireField(section, "segment", ctx);
    SegmentPtr psSegment = SegmentFromJson(nlohmann::ordered_json::parse(segment.dump()),
                                           envelope.osSource + " (srit.segment)");
    LumoSatEphemerisFree(model->psEphemeris);
    model->psEphemeris = psSegment.release();
    EnvelopeToProjInfo(envelope, model->psProjInfo);
    FillLineArrays(*model);
    RequireValidRecord(envelope, "srit", SRITValidate(model.get()));
    return model;
}

std::shared_ptr<void> ReadSritRecord(const ModelEnvelope& envelope, const json& section) {
    return ShareSritRecord(SritFromJson(envelope, section));
}

std::shared_ptr<void> ShareSritRecord(SritPtr model) {
    return std::shared_ptr<void>(model.release(),
                                 [](void* p) { LumoFreeSRITInfo(static_cast<SRITInfo_t*>(p)); });
}

json SritToJson(const SRITInfo_t& model) {
    if (model.psEphemeris == nullptr || model.psProjInfo == nullptr) {
        LUMO_CLI_FAIL("cannot write model: the rigorous record has no segment or projection");
    }
    const EphemerisSeg_t& segment = *model.psEphemeris;
    json document = MakeEnvelope("srit", model.psProjInfo->szProj, model.psProjInfo,
                                 segment.nNumPixels, segment.nNumLines);
    json section = json::object();
    section["coefficients"] =
        FiniteNumberArray(model.adfCoef, SRIT_NUM_COEFS, ItemLabel{"coefficient ", ""});
    section["sensor"] = BufferText(model.Sensor, SRIT_SENSOR_SIZE);
    section["sensorCode"] = model.nSensor;
    section["modelClass"] = model.nModelClass;
    section["downsample"] = model.anAux[0];
    const char* pszForm = FormWord(model.anAux[SRIT_AUX_FORM]);
    if (pszForm == nullptr) {
        LUMO_CLI_FAIL("cannot write model: the rigorous record's form (anAux[" +
                      std::to_string(SRIT_AUX_FORM) + "]) is " +
                      std::to_string(model.anAux[SRIT_AUX_FORM]) + ", neither classic nor curved");
    }
    section["elevationScale"] = pszForm;
    section["workingGeosys"] = BufferText(model.szAuxA, SRIT_AUX_TEXT_SIZE - 1);
    section["groundGeosys"] = BufferText(model.szAuxB, SRIT_AUX_TEXT_SIZE - 1);
    section["segment"] = json::parse(SegmentToJson(segment).dump());
    document["srit"] = std::move(section);
    return document;
}

}  // namespace lumo::cli
