#include "rf_io.h"

#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <string>

#include "cli_error.h"
#include "nova/projection.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

constexpr const char* kFamily = "rf";

// Field access within the "rf" section, failing with the file and field.
struct Section {
    const std::string& osSource;
    const json& oObject;

    [[noreturn]] void Fail(const char* name, const std::string& problem) const {
        LUMO_CLI_FAIL(osSource + ": field " + Quoted(std::string(kFamily) + "." + name) + " " +
                      problem);
    }
    const json& Require(const char* name) const {
        const auto it = oObject.find(name);
        if (it == oObject.end()) Fail(name, "is missing");
        return *it;
    }
    int Int(const char* name, std::int64_t minimum, std::int64_t maximum) const {
        const json& value = Require(name);
        if (!value.is_number_integer()) Fail(name, "must be an integer, found " + value.dump());
        const bool fits = !value.is_number_unsigned() ||
                          value.get<std::uint64_t>() <=
                              static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());
        const std::int64_t n = fits ? value.get<std::int64_t>() : maximum + 1;
        if (n < minimum || n > maximum) {
            Fail(name, "must lie in " + std::to_string(minimum) + ".." + std::to_string(maximum) +
                           ", found " + value.dump());
        }
        return static_cast<int>(n);
    }
    int OptionalInt(const char* name, std::int64_t minimum, std::int64_t maximum,
                    int fallback) const {
        return oObject.contains(name) ? Int(name, minimum, maximum) : fallback;
    }
    double Number(const json& value, const char* name, const std::string& where) const {
        const double number = value.is_number() ? value.get<double>() : std::nan("");
        if (!std::isfinite(number)) {
            Fail(name, where + "must be a finite number, found " + value.dump());
        }
        return number;
    }
    double Double(const char* name) const { return Number(Require(name), name, ""); }
    double Scale(const char* name) const {
        const double scale = Double(name);
        if (scale == 0.0) Fail(name, "must not be 0");
        return scale;
    }
    void Array(const char* name, std::size_t count, double* target) const {
        const json& value = Require(name);
        if (!value.is_array() || value.size() != count) {
            Fail(name,
                 "must be an array of " + std::to_string(count) + " numbers, found " +
                     (value.is_array() ? std::to_string(value.size()) + " items" : value.dump()));
        }
        for (std::size_t k = 0; k < count; ++k) {
            target[k] = Number(value[k], name, "item " + std::to_string(k) + " ");
        }
    }
};

// Copies a text into a record buffer that holds 16 characters; a longer one
// is refused rather than cut, as the file should say what the model holds.
void CopyText(const std::string& osSource, const char* name, const std::string& text,
              char* buffer) {
    if (text.size() >= static_cast<std::size_t>(RF_TEXT_SIZE)) {
        LUMO_CLI_FAIL(osSource + ": field " + Quoted(name) + ": " + Quoted(text) +
                      " is longer than " + std::to_string(RF_TEXT_SIZE - 1) + " characters");
    }
    std::memcpy(buffer, text.c_str(), text.size() + 1);
}

json Numbers(const double* values, int count, const char* name) {
    json array = json::array();
    for (int k = 0; k < count; ++k) {
        if (!std::isfinite(values[k])) {
            LUMO_CLI_FAIL(std::string("cannot write model: item ") + std::to_string(k) + " of " +
                          Quoted(name) + " is not finite");
        }
        array.push_back(values[k]);
    }
    return array;
}

double Finite(double value, const char* name) {
    if (!std::isfinite(value)) {
        LUMO_CLI_FAIL(std::string("cannot write model: ") + Quoted(name) + " is not finite");
    }
    return value;
}

std::string BufferText(const char* buffer) {
    return buffer ? std::string(buffer, strnlen(buffer, RF_TEXT_SIZE - 1)) : std::string();
}

}  // namespace

RFPtr RFFromJson(const ModelEnvelope& envelope, const json& section) {
    const Section s{envelope.osSource, section};
    const int nTerms = s.Int("nTerms", 0, RF_MAX_TERMS);
    RFPtr rf(RFAllocate(nullptr, nTerms));
    rf->nHalfPixelShift = s.OptionalInt("halfPixelShift", 0, 1, 1);
    rf->nDownsample = s.OptionalInt("downsample", 1, 999, 1);
    rf->nExtra1 = s.OptionalInt("extra1", std::numeric_limits<int>::min(),
                                std::numeric_limits<int>::max(), 0);
    rf->nExtra2 = s.OptionalInt("extra2", std::numeric_limits<int>::min(),
                                std::numeric_limits<int>::max(), 0);
    rf->dfXOffset = s.Double("xOffset");
    rf->dfXScale = s.Scale("xScale");
    rf->dfYOffset = s.Double("yOffset");
    rf->dfYScale = s.Scale("yScale");
    rf->dfZOffset = s.Double("zOffset");
    rf->dfZScale = s.Scale("zScale");
    rf->dfPixelOffset = s.Double("pixelOffset");
    rf->dfPixelScale = s.Scale("pixelScale");
    rf->dfLineOffset = s.Double("lineOffset");
    rf->dfLineScale = s.Scale("lineScale");
    rf->nAdjust = s.OptionalInt("adjust", 0, 1, 0);
    // The adjustment terms are kept when given, in force or not.
    if (rf->nAdjust || section.contains("pixelAdjust") || section.contains("lineAdjust")) {
        s.Array("pixelAdjust", RF_ADJUST_TERMS, rf->adfPixelAdjust);
        s.Array("lineAdjust", RF_ADJUST_TERMS, rf->adfLineAdjust);
    }
    s.Array("pixelNum", nTerms, rf->padfPixelNum);
    s.Array("pixelDen", nTerms, rf->padfPixelDen);
    s.Array("lineNum", nTerms, rf->padfLineNum);
    s.Array("lineDen", nTerms, rf->padfLineDen);
    if (section.contains("sensor")) {
        const json& sensor = section["sensor"];
        if (!sensor.is_string()) s.Fail("sensor", "must be a text, found " + sensor.dump());
        CopyText(envelope.osSource, "rf.sensor", sensor.get<std::string>(), rf->pszSensor);
    }
    CopyText(envelope.osSource, "geosys", envelope.osGeosys, rf->pszGeosys);
    EnvelopeToProjInfo(envelope, rf->psProjInfo);
    return rf;
}

json RFToJson(const RFInfo_t& rf, int nPixels, int nLines) {
    if (rf.nTerms < 0 || rf.nTerms > RF_MAX_TERMS) {
        LUMO_CLI_FAIL("cannot write model: nTerms " + std::to_string(rf.nTerms) +
                      " lies outside 0..20");
    }
    json document =
        MakeEnvelope(kFamily, BufferText(rf.pszGeosys).c_str(), rf.psProjInfo, nPixels, nLines);
    json section = json::object();
    section["nTerms"] = rf.nTerms;
    section["halfPixelShift"] = rf.nHalfPixelShift ? 1 : 0;
    section["downsample"] = rf.nDownsample;
    section["extra1"] = rf.nExtra1;
    section["extra2"] = rf.nExtra2;
    section["sensor"] = BufferText(rf.pszSensor);
    section["xOffset"] = Finite(rf.dfXOffset, "xOffset");
    section["xScale"] = Finite(rf.dfXScale, "xScale");
    section["yOffset"] = Finite(rf.dfYOffset, "yOffset");
    section["yScale"] = Finite(rf.dfYScale, "yScale");
    section["zOffset"] = Finite(rf.dfZOffset, "zOffset");
    section["zScale"] = Finite(rf.dfZScale, "zScale");
    section["pixelOffset"] = Finite(rf.dfPixelOffset, "pixelOffset");
    section["pixelScale"] = Finite(rf.dfPixelScale, "pixelScale");
    section["lineOffset"] = Finite(rf.dfLineOffset, "lineOffset");
    section["lineScale"] = Finite(rf.dfLineScale, "lineScale");
    section["adjust"] = rf.nAdjust ? 1 : 0;
    section["pixelAdjust"] = Numbers(rf.adfPixelAdjust, RF_ADJUST_TERMS, "pixelAdjust");
    section["lineAdjust"] = Numbers(rf.adfLineAdjust, RF_ADJUST_TERMS, "lineAdjust");
    section["pixelNum"] = Numbers(rf.padfPixelNum, rf.nTerms, "pixelNum");
    section["pixelDen"] = Numbers(rf.padfPixelDen, rf.nTerms, "pixelDen");
    section["lineNum"] = Numbers(rf.padfLineNum, rf.nTerms, "lineNum");
    section["lineDen"] = Numbers(rf.padfLineDen, rf.nTerms, "lineDen");
    document[kFamily] = std::move(section);
    return document;
}

std::shared_ptr<void> ShareRFRecord(RFPtr rf) {
    return std::shared_ptr<void>(rf.release(),
                                 [](void* p) { RFDeallocate(static_cast<RFInfo_t*>(p)); });
}

std::shared_ptr<void> ReadRFRecord(const ModelEnvelope& envelope, const json& section) {
    return ShareRFRecord(RFFromJson(envelope, section));
}

}  // namespace lumo::cli
