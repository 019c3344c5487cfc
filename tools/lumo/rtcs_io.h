// Radar model files: the common model envelope ("family": "rtcs", ground
// coordinates "LONG/LAT D000") and an "rtcs" section with what the model is
// generated from: the height reference and georeferencing of the control
// points, the points themselves, the downsample factor and the image's
// radar segment (in the segment file's own JSON form). Reading a file
// generates the model again, so the file holds no derived tables.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "lumo.h"
#include "model_io.h"

namespace lumo::cli {

struct RtcsDeleter {
    void operator()(RTCSInfo_t* psModel) const noexcept { RTCSFreeModel(psModel); }
};
using RtcsPtr = std::unique_ptr<RTCSInfo_t, RtcsDeleter>;

// Generates the model of a file's envelope and "rtcs" section. Every failure
// throws nova::DataException naming the file and the field, or the reason the
// model cannot be generated.
RtcsPtr RtcsFromJson(const ModelEnvelope& envelope, const nlohmann::json& section);
std::shared_ptr<void> ReadRtcsRecord(const ModelEnvelope& envelope, const nlohmann::json& section);

// The model file of a generated record (which keeps its segment, points and
// their projection).
nlohmann::json RtcsToJson(const RTCSInfo_t& model);

// Generates a model with the library, turning its fatal errors and
// exceptions into the tool's failure naming `osSource`.
RtcsPtr GenerateRtcs(const EphemerisSeg_t& segment, const ProjInfo_t& sProj,
                     const std::string& osHeightRef, const std::vector<ControlPoint_t>& aoGcps,
                     const std::string& osSource);

}  // namespace lumo::cli
