// Rigorous model files: the common model envelope ("family": "srit") and a
// "srit" section with the 23 coefficients, the sensor row the computation
// chose, the downsample factor, the form of the elevation scale
// ("elevationScale", absent in files written before it existed: classic),
// the working projection texts and the
// image's ephemeris segment (in the segment file's own JSON form).
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include <nlohmann/json.hpp>

#include "lumo.h"
#include "model_io.h"

namespace lumo::cli {

struct SritDeleter {
    void operator()(SRITInfo_t* psModel) const noexcept { LumoFreeSRITInfo(psModel); }
};
using SritPtr = std::unique_ptr<SRITInfo_t, SritDeleter>;

// The words of the model form (anAux[SRIT_AUX_FORM]) in files and options:
// "classic" and "curved". FormWord returns null for an unknown form,
// FormOfWord -1 for any other word.
const char* FormWord(int32_t nForm);
int32_t FormOfWord(const std::string& word);

// Builds a record from a model file's envelope and "srit" section. Every
// failure throws nova::DataException naming the file and the field.
SritPtr SritFromJson(const ModelEnvelope& envelope, const nlohmann::json& section);
std::shared_ptr<void> ReadSritRecord(const ModelEnvelope& envelope, const nlohmann::json& section);
std::shared_ptr<void> ShareSritRecord(SritPtr model);

// The model file of a computed record; the record must hold a segment and a
// projection. Reading it back gives the same coefficients bit for bit.
nlohmann::json SritToJson(const SRITInfo_t& model);

}  // namespace lumo::cli
