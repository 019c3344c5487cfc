// Model files of the rational function family: the "rf" section of a JSON
// model file, read into and written from RFInfo_t.
#pragma once

#include <memory>
#include <vector>

#include <nlohmann/json.hpp>

#include "model_io.h"

namespace lumo::cli {

struct RFDeleter {
    void operator()(RFInfo_t* psRF) const noexcept { RFDeallocate(psRF); }
};
using RFPtr = std::unique_ptr<RFInfo_t, RFDeleter>;

// The record of an "rf" section. Throws nova::DataException naming the file
// and the field for anything missing, out of range or not finite.
RFPtr RFFromJson(const ModelEnvelope& envelope, const nlohmann::json& section);
// A complete model file (envelope and section) for a record, with the fields
// of the RPC text it came from ("rpcFields") when there are any.
nlohmann::json RFToJson(const RFInfo_t& rf, int nPixels, int nLines,
                        const std::vector<LumoRPCField>& fields = {});
// The RPC text fields an "rf" section carries (none when it has no "rpcFields").
std::vector<LumoRPCField> RPCFieldsFromJson(const ModelEnvelope& envelope,
                                            const nlohmann::json& section);
// Reader registered in ModelFamilies().
std::shared_ptr<void> ReadRFRecord(const ModelEnvelope& envelope, const nlohmann::json& section);
// Hands a record to the type-erased owner of LoadedModel.
std::shared_ptr<void> ShareRFRecord(RFPtr rf);

}  // namespace lumo::cli
