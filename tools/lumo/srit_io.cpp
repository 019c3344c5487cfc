#include "srit_io.h"

#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <string>

#include "cli_error.h"
#include "segment_io.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

[[noreturn]] void FailField(const ModelEnvelope& envelope, const char* pszName,
                            const std::string& problem) {
    LUMO_CLI_FAIL(envelope.osSource + ": field " + Quoted(std::string("srit.") + pszName) + " " +
                  problem);
}

const json& Require(const ModelEnvelope& envelope, const json& section, const char* pszName) {
    const auto it = section.find(pszName);
    if (it == section.end()) FailField(envelope, pszName, "is missing");
    return *it;
}

int ReadInt(const ModelEnvelope& envelope, const json& section, const char* pszName, int nMin,
            int nMax) {
    const json& value = Require(envelope, section, pszName);
    if (!value.is_number_integer() || value.get<double>() < nMin || value.get<double>() > nMax) {
        FailField(envelope, pszName,
                  "must be an integer in " + std::to_string(nMin) + ".." + std::to_string(nMax) +
                      ", found " + value.dump());
    }
    return value.get<int>();
}

// A fixed text field of the record: at most nSize - 1 characters unless
// bMayFill, in which case all nSize may be used (no terminator).
void ReadText(const ModelEnvelope& envelope, const json& section, const char* pszName,
              char* pszTarget, std::size_t nSize, bool bMayFill) {
    const auto it = section.find(pszName);
    if (it == section.end()) return;  // optional: stays empty
    if (!it->is_string()) FailField(envelope, pszName, "must be a text, found " + it->dump());
    const std::string text = it->get<std::string>();
    if (text.size() > (bMayFill ? nSize : nSize - 1)) {
        FailField(envelope, pszName, Quoted(text) + " is longer than the record holds");
    }
    std::copy(text.begin(), text.end(), pszTarget);  // the field is zero-filled
}

// The coefficients that the transforms divide by must not be zero.
void CheckDivisors(const ModelEnvelope& envelope, const double* c) {
    const int anDivisors[] = {0, 2, 6, 11, 12};
    for (int k : anDivisors) {
        if (c[k] == 0.0) {
            FailField(envelope, "coefficients",
                      "item " + std::to_string(k) + " is 0, but the model divides by it");
        }
    }
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

std::string FixedText(const char* pszText, std::size_t nSize) {
    return std::string(pszText, strnlen(pszText, nSize));
}

}  // namespace

SritPtr SritFromJson(const ModelEnvelope& envelope, const json& section) {
    if (!section.is_object()) LUMO_CLI_FAIL(envelope.osSource + ": \"srit\" must be an object");
    SritPtr model(SRITAllocate());
    const json& coefficients = Require(envelope, section, "coefficients");
    if (!coefficients.is_array() || coefficients.size() != SRIT_NUM_COEFS) {
        FailField(envelope, "coefficients",
                  "must be an array of " + std::to_string(SRIT_NUM_COEFS) + " numbers");
    }
    for (int k = 0; k < SRIT_NUM_COEFS; ++k) {
        const json& item = coefficients[static_cast<std::size_t>(k)];
        const double value = item.is_number() ? item.get<double>() : std::nan("");
        if (!std::isfinite(value)) {
            FailField(
                envelope, "coefficients",
                "item " + std::to_string(k) + " must be a finite number, found " + item.dump());
        }
        model->adfCoef[k] = value;
    }
    CheckDivisors(envelope, model->adfCoef);
    model->nSensor = ReadInt(envelope, section, "sensorCode", 0, 186);
    model->nModelClass = ReadInt(envelope, section, "modelClass", -999, 6);
    model->anAux[0] = ReadInt(envelope, section, "downsample", 0, 1 << 20);
    ReadText(envelope, section, "sensor", model->Sensor, SRIT_SENSOR_SIZE, true);
    ReadText(envelope, section, "workingGeosys", model->szAuxA, SRIT_AUX_TEXT_SIZE, false);
    ReadText(envelope, section, "groundGeosys", model->szAuxB, SRIT_AUX_TEXT_SIZE, false);
    const json& segment = Require(envelope, section, "segment");
    SegmentPtr psSegment = SegmentFromJson(nlohmann::ordered_json::parse(segment.dump()),
                                           envelope.osSource + " (srit.segment)");
    LumoSatEphemerisFree(model->psEphemeris);
    model->psEphemeris = psSegment.release();
    EnvelopeToProjInfo(envelope, model->psProjInfo);
    FillLineArrays(*model);
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
    json coefficients = json::array();
    for (int k = 0; k < SRIT_NUM_COEFS; ++k) {
        if (!std::isfinite(model.adfCoef[k])) {
            LUMO_CLI_FAIL("cannot write model: coefficient " + std::to_string(k) +
                          " is not finite");
        }
        coefficients.push_back(model.adfCoef[k]);
    }
    section["coefficients"] = std::move(coefficients);
    section["sensor"] = FixedText(model.Sensor, SRIT_SENSOR_SIZE);
    section["sensorCode"] = model.nSensor;
    section["modelClass"] = model.nModelClass;
    section["downsample"] = model.anAux[0];
    section["workingGeosys"] = FixedText(model.szAuxA, SRIT_AUX_TEXT_SIZE - 1);
    section["groundGeosys"] = FixedText(model.szAuxB, SRIT_AUX_TEXT_SIZE - 1);
    section["segment"] = json::parse(SegmentToJson(segment).dump());
    document["srit"] = std::move(section);
    return document;
}

}  // namespace lumo::cli
