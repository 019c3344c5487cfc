// Aerial photo models in model files: the "ap" section with the camera's
// exterior orientation, focal length, fiducial transforms and corrections.
#pragma once

#include <memory>

#include <nlohmann/json.hpp>

#include "lumo.h"
#include "model_io.h"

namespace lumo::cli {

struct ApDeleter {
    void operator()(APInfo_t* psAP) const noexcept { APDeallocate(psAP); }
};
using ApPtr = std::unique_ptr<APInfo_t, ApDeleter>;

// Builds the record from the envelope and its "ap" section. Throws
// nova::DataException naming the file, the field and the bad value.
ApPtr ApFromJson(const ModelEnvelope& envelope, const nlohmann::json& section);
// The reader registered in ModelFamilies().
std::shared_ptr<void> ReadApRecord(const ModelEnvelope& envelope, const nlohmann::json& section);
// The whole model file of a record; the record holds no raster size, so the
// caller gives it. Throws when a value cannot be written (not finite, a text
// that does not fit its buffer).
nlohmann::json ApToJson(const APInfo_t& ap, int nPixels, int nLines);

}  // namespace lumo::cli
