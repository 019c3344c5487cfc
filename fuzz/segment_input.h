// Reads a fuzz input as a segment file, the way the tool reads one.
#pragma once

#include <cstddef>
#include <cstdint>
#include <nlohmann/json.hpp>

#include "runtime.h"
#include "segment_io.h"

namespace lumo::fuzz {

// The segment the bytes describe, or null when they are not JSON or the
// reader refuses them with a message (the expected outcome for bad input).
inline lumo::cli::SegmentPtr SegmentFromBytes(const std::uint8_t* pabyData, std::size_t nSize) {
    const auto document = nlohmann::ordered_json::parse(pabyData, pabyData + nSize, nullptr,
                                                        /*allow_exceptions=*/false);
    if (document.is_discarded()) return nullptr;
    try {
        return lumo::cli::SegmentFromJson(document, "fuzz");
    } catch (const nova::DataException&) {
        return nullptr;
    }
}

}  // namespace lumo::fuzz
