// Ephemeris segment files: one JSON object {"format": "lumo-segment",
// "version": 1, ...} whose members are the fields of EphemerisSeg_t under
// their own names, plus "orbitData" for the orbit sub-record and its line
// table (docs/segments.md). Every field is optional on reading (a missing
// field is zero or empty, as in a freshly allocated segment) and always
// written.
#pragma once

#include <memory>
#include <string>

#include <nlohmann/json.hpp>

#include "lumo.h"

namespace lumo::cli {

constexpr const char* kSegmentFormat = "lumo-segment";
constexpr int kSegmentFormatVersion = 1;

struct SegmentDeleter {
    void operator()(EphemerisSeg_t* psSeg) const noexcept { LumoSatEphemerisFree(psSeg); }
};
using SegmentPtr = std::unique_ptr<EphemerisSeg_t, SegmentDeleter>;

// Builds a segment from a document. Every failure throws nova::DataException
// with a message naming `source` and the field (with its position in arrays).
SegmentPtr SegmentFromJson(const nlohmann::ordered_json& document, const std::string& source);
SegmentPtr ReadSegmentFile(const std::string& path);

// The document of a segment; reading it back gives the same segment bit for
// bit, except that every not-a-number becomes the same quiet one. Throws
// nova::DataException when a text fills its field without a terminator.
nlohmann::ordered_json SegmentToJson(const EphemerisSeg_t& segment);
// Indented JSON text with each line of a line table on one text line.
std::string FormatSegmentJson(const nlohmann::ordered_json& document);
void WriteSegmentFile(const std::string& path, const EphemerisSeg_t& segment);

// A few lines for people: sensor and its code, image size, orbit sub-record.
std::string DescribeSegment(const EphemerisSeg_t& segment);

}  // namespace lumo::cli
