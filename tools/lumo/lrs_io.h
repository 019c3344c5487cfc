// Orbit model files: the common model envelope ("family": "lrs", ground
// coordinates "LONG/LAT D000") and an "lrs" section with the model's epoch,
// times, mean elements, scanner, state-table frame, the nine refinement
// values and the control points of the refinement (docs/files.md).
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "lumo.h"
#include "model_io.h"
#include "points_io.h"

namespace lumo::cli {

struct CommandContext;

constexpr const char* kLrsGeosys = "LONG/LAT D000";

using LrsPtr = std::unique_ptr<LRSOrbitModel_t>;

// Builds a model (with its state table) from a model file's envelope and
// "lrs" section. Every failure throws nova::DataException naming the file
// and the field.
LrsPtr LrsFromJson(const ModelEnvelope& envelope, const nlohmann::json& section);
std::shared_ptr<void> ReadLrsRecord(const ModelEnvelope& envelope, const nlohmann::json& section);

// The model file of a model; reading it back gives the same model bit for bit.
nlohmann::json LrsToJson(const LRSOrbitModel_t& model);

// Runs a library call on a model or segment and turns its numbered error
// into a data exception naming `source`.
void CheckedLrsCall(const std::string& source, const std::function<void()>& call);

// `lumo fit --model lrs`: the nominal model of the pass of `segmentPath`,
// refined with the control points (longitude, latitude, ellipsoidal height;
// other ground coordinates declared by `geosys` are converted), written to
// `outputPath`.
void RunLrsFit(PointSet& gcps, const std::string& segmentPath, const std::string& geosys,
               const std::string& outputPath, CommandContext& context);

}  // namespace lumo::cli
