// libFuzzer target: ephemeris segment files from arbitrary bytes. Bad JSON
// and bad fields must be refused with a host data exception; a segment that
// reads must write and read back to the same document.

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>

#include <nlohmann/json.hpp>

#include "fuzz_support.h"
#include "runtime.h"
#include "segment_io.h"

namespace {

using lumo::fuzz::Check;

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* pabyData, std::size_t nSize) {
    const auto document = nlohmann::ordered_json::parse(pabyData, pabyData + nSize, nullptr,
                                                        /*allow_exceptions=*/false);
    if (document.is_discarded()) return 0;
    lumo::cli::SegmentPtr psSegment;
    try {
        psSegment = lumo::cli::SegmentFromJson(document, "fuzz");
    } catch (const nova::DataException&) {
        return 0;  // refused with a message: the expected outcome for bad input
    }
    Check(psSegment != nullptr);
    // Written, the segment reads back to a segment that writes the same text.
    nlohmann::ordered_json written;
    try {
        written = lumo::cli::SegmentToJson(*psSegment);
    } catch (const nova::DataException&) {
        return 0;  // a text that fills its field without a terminator
    }
    const std::string osText = lumo::cli::FormatSegmentJson(written);
    const lumo::cli::SegmentPtr psBack =
        lumo::cli::SegmentFromJson(nlohmann::ordered_json::parse(osText), "rewritten");
    Check(psBack != nullptr);
    Check(lumo::cli::FormatSegmentJson(lumo::cli::SegmentToJson(*psBack)) == osText);
    return 0;
}
