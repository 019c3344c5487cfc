// Thin plate spline models in model files: the "tps" section with one fitted
// spline per direction (control points, affine part and radial weights).
#pragma once

#include <memory>

#include <nlohmann/json.hpp>

#include "lumo.h"
#include "model_io.h"

namespace lumo::cli {

struct TpsDeleter {
    void operator()(TPSMInfo_t* psModel) const noexcept { TPSDeallocate(psModel); }
};
using TpsPtr = std::unique_ptr<TPSMInfo_t, TpsDeleter>;

// Builds the record from the envelope and its "tps" section. Throws
// nova::DataException naming the file, the field and the bad value.
TpsPtr TpsFromJson(const ModelEnvelope& envelope, const nlohmann::json& section);
// The reader registered in ModelFamilies().
std::shared_ptr<void> ReadTpsRecord(const ModelEnvelope& envelope, const nlohmann::json& section);
// Hands a spline record to the type-erased owner of LoadedModel.
std::shared_ptr<void> ShareTpsRecord(TpsPtr tps);
// The whole model file of a record. Throws when a value cannot be written
// (not finite) or a container holds no spline.
nlohmann::json TpsToJson(const TPSMInfo_t& tps);

}  // namespace lumo::cli
