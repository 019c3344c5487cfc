#include "segment_io.h"

#include <algorithm>
#include <cfloat>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <fstream>
#include <initializer_list>
#include <limits>
#include <sstream>

#include "cli_error.h"
#include "json_fields.h"
#include "model_io.h"
#include "nova/runtime.h"

namespace lumo::cli {
namespace {

using Json = nlohmann::ordered_json;

template <typename T>
using HostPtr = std::unique_ptr<T, nova::FreeDeleter>;

// How one record field is stored in the file.
enum class FieldKind {
    Text,     // char[nCount], at most nCount - 1 characters
    Int32,    // integer
    Byte,     // integer 0..255
    Double,   // number, or "NaN", "Infinity", "-Infinity"
    Float,    // number within the float range, or the same texts
    Doubles,  // array of nCount doubles
    Int32s,   // array of nCount integers
    Bytes,    // array of nCount integers 0..255
    Hex,      // nCount bytes as 2 * nCount hex digits; "" for all zero
};

struct FieldSpec {
    const char* pszName;
    FieldKind eKind;
    std::size_t nOffset;
    int nCount;
};

#define SEG_FIELD(Record, name, kind, count)                  \
    FieldSpec {                                               \
#name, FieldKind::kind, offsetof(Record, name), count \
    }
// The field names are member names, which cannot take parentheses.
#define SEG_TEXT(Record, name) \
    SEG_FIELD(Record, name, Text, sizeof(Record{}.name))  // NOLINT(bugprone-macro-parentheses)

// clang-format off
const FieldSpec kSegmentFields[] = {
    SEG_TEXT(EphemerisSeg_t, szHeaderText1),
    SEG_TEXT(EphemerisSeg_t, szHeaderText2),
    SEG_TEXT(EphemerisSeg_t, szSensorName),
    SEG_TEXT(EphemerisSeg_t, szSensorExtra),
    SEG_TEXT(EphemerisSeg_t, szAcquisitionDate),
    SEG_FIELD(EphemerisSeg_t, nSupplementFlag, Int32, 1),
    SEG_FIELD(EphemerisSeg_t, dfIFOV, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfViewAngle, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfCentreColumn, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfCentreLine, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfSatVelocity, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfAngularSpeed, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfOrbitSpare1, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfSatHeight, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfInclination, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfLineInterval, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfAscNodeLongitude, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfPerigeeArgument, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfOrbitSpare2, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfCentreLatitude, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfOrbitRadius, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfPitchAngle, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfOrbitSpare3, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfOrbitSpare4, Double, 1),
    SEG_TEXT(EphemerisSeg_t, szGeosys),
    SEG_FIELD(EphemerisSeg_t, bCarriedFlag, Byte, 1),
    SEG_FIELD(EphemerisSeg_t, dfPixelRes, Double, 1),
    SEG_FIELD(EphemerisSeg_t, dfLineRes, Double, 1),
    SEG_FIELD(EphemerisSeg_t, nCarried1, Int32, 1),
    SEG_FIELD(EphemerisSeg_t, adfCarriedA, Doubles, EPH_CARRIED_A_COUNT),
    SEG_FIELD(EphemerisSeg_t, dfAvgHeight, Double, 1),
    SEG_FIELD(EphemerisSeg_t, adfCarriedB, Doubles, EPH_CARRIED_B_COUNT),
    SEG_FIELD(EphemerisSeg_t, nLevelConvForm, Int32, 1),
    SEG_FIELD(EphemerisSeg_t, anLevelConvParams, Int32s, EPH_LEVEL_PARAM_COUNT),
    SEG_FIELD(EphemerisSeg_t, adfLevelConvCoefs, Doubles, EPH_LEVEL_COEF_COUNT),
    SEG_FIELD(EphemerisSeg_t, nBytesPerRecord, Int32, 1),
    SEG_FIELD(EphemerisSeg_t, nNumLines, Int32, 1),
    SEG_FIELD(EphemerisSeg_t, nBytesPerPixel, Int32, 1),
    SEG_FIELD(EphemerisSeg_t, nNumPixels, Int32, 1),
    SEG_FIELD(EphemerisSeg_t, nPrefixBytes, Int32, 1),
    SEG_FIELD(EphemerisSeg_t, nSuffixBytes, Int32, 1),
    SEG_FIELD(EphemerisSeg_t, nCarried2, Int32, 1),
    SEG_FIELD(EphemerisSeg_t, nOrbitType, Int32, 1),
};

const FieldSpec kAttitudeFields[] = {
    SEG_FIELD(AttitudeData_t, dfAttitude1, Double, 1),
    SEG_FIELD(AttitudeData_t, dfAttitude2, Double, 1),
    SEG_FIELD(AttitudeData_t, dfAttitude3, Double, 1),
};
const FieldSpec kAttitudeColumns[] = {
    SEG_FIELD(AttitudeLine_t, dfValue1, Double, 1),
    SEG_FIELD(AttitudeLine_t, dfValue2, Double, 1),
};

const FieldSpec kRadarFields[] = {
    SEG_FIELD(RadarData_t, abyLeading, Hex, RADAR_LEADING_SIZE),
};
const FieldSpec kRadarColumns[] = {
    SEG_FIELD(RadarLine_t, nRangeFirst, Int32, 1),
    SEG_FIELD(RadarLine_t, nRangeLast, Int32, 1),
    SEG_FIELD(RadarLine_t, fLatFirst, Float, 1),
    SEG_FIELD(RadarLine_t, fLatMid, Float, 1),
    SEG_FIELD(RadarLine_t, fLatLast, Float, 1),
    SEG_FIELD(RadarLine_t, fLonFirst, Float, 1),
    SEG_FIELD(RadarLine_t, fLonMid, Float, 1),
    SEG_FIELD(RadarLine_t, fLonLast, Float, 1),
};

const FieldSpec kAvhrrFields[] = {
    SEG_FIELD(AvhrrData_t, abyLeading, Hex, AVHRR_LEADING_SIZE),
    SEG_FIELD(AvhrrData_t, nTimeDirection, Int32, 1),
    SEG_TEXT(AvhrrData_t, szField1),
    SEG_TEXT(AvhrrData_t, szField2),
    SEG_TEXT(AvhrrData_t, szEpochYearDay),
    SEG_TEXT(AvhrrData_t, szEpochMsOfDay),
    SEG_TEXT(AvhrrData_t, szClockOffset),
    SEG_TEXT(AvhrrData_t, szField6),
    SEG_TEXT(AvhrrData_t, szField7),
    SEG_TEXT(AvhrrData_t, szField8),
    SEG_TEXT(AvhrrData_t, szField9),
    SEG_TEXT(AvhrrData_t, szField10),
    SEG_TEXT(AvhrrData_t, szField11),
    SEG_TEXT(AvhrrData_t, szField12),
    SEG_TEXT(AvhrrData_t, szField13),
    SEG_TEXT(AvhrrData_t, szEpochHour),
    SEG_TEXT(AvhrrData_t, szEpochMinute),
    SEG_TEXT(AvhrrData_t, szEpochMillisecond),
    SEG_TEXT(AvhrrData_t, szGreenwichAngle),
    SEG_TEXT(AvhrrData_t, szField18),
    SEG_TEXT(AvhrrData_t, szField19),
    SEG_TEXT(AvhrrData_t, szEccentricity),
    SEG_TEXT(AvhrrData_t, szPerigeeArgument),
    SEG_TEXT(AvhrrData_t, szAscNodeLongitude),
    SEG_TEXT(AvhrrData_t, szInclination),
    SEG_TEXT(AvhrrData_t, szMeanAnomaly),
    SEG_TEXT(AvhrrData_t, szSemiMajorAxis),
    SEG_TEXT(AvhrrData_t, szField26),
};
const FieldSpec kAvhrrColumns[] = {
    SEG_FIELD(AvhrrLine_t, nCarried, Int32, 1),
    SEG_FIELD(AvhrrLine_t, nTimeMs, Int32, 1),
    SEG_FIELD(AvhrrLine_t, abyCarriedA, Hex, sizeof(AvhrrLine_t{}.abyCarriedA)),
    SEG_FIELD(AvhrrLine_t, abyTimeCode, Bytes, AVHRR_TIME_CODE_SIZE),
    SEG_FIELD(AvhrrLine_t, abyCarriedB, Hex, sizeof(AvhrrLine_t{}.abyCarriedB)),
};
// clang-format on

#undef SEG_TEXT
#undef SEG_FIELD

template <std::size_t N>
std::pair<const FieldSpec*, std::size_t> Table(const FieldSpec (&asFields)[N]) {
    return {asFields, N};
}

// One kind of orbit sub-record: its scalar fields, and its line table with
// the columns of one line.
template <typename Sub, typename Line>
struct SubRecordCodec {
    const char* pszKind;
    std::pair<const FieldSpec*, std::size_t> sFields;
    const char* pszCountName;
    const char* pszLinesName;
    std::pair<const FieldSpec*, std::size_t> sColumns;
    int32_t Sub::*pnCount;
    Line* Sub::*ppLines;
};

const SubRecordCodec<AttitudeData_t, AttitudeLine_t> kAttitudeCodec = {
    "attitude",
    Table(kAttitudeFields),
    "nNumAttitudeLines",
    "pAttitudeLines",
    Table(kAttitudeColumns),
    &AttitudeData_t::nNumAttitudeLines,
    &AttitudeData_t::pAttitudeLines};
const SubRecordCodec<RadarData_t, RadarLine_t> kRadarCodec = {"radar",
                                                              Table(kRadarFields),
                                                              "nNumLinePositions",
                                                              "pLinePositions",
                                                              Table(kRadarColumns),
                                                              &RadarData_t::nNumLinePositions,
                                                              &RadarData_t::pLinePositions};
const SubRecordCodec<AvhrrData_t, AvhrrLine_t> kAvhrrCodec = {"AVHRR",
                                                              Table(kAvhrrFields),
                                                              "nNumScanLines",
                                                              "pScanLines",
                                                              Table(kAvhrrColumns),
                                                              &AvhrrData_t::nNumScanLines,
                                                              &AvhrrData_t::pScanLines};

constexpr const char* kOrbitDataName = "orbitData";

// ---------------------------------------------------------------------------
// Values
// ---------------------------------------------------------------------------

// Texts are byte strings; bytes above 127 travel as the characters U+0080 to
// U+00FF so that any text survives the trip through UTF-8.
std::string BytesToUtf8(const char* pszText, std::size_t nLength) {
    std::string osOut;
    for (std::size_t i = 0; i < nLength; ++i) {
        const auto c = static_cast<unsigned char>(pszText[i]);
        if (c < 0x80) {
            osOut += static_cast<char>(c);
        } else {
            osOut += static_cast<char>(0xC0 | (c >> 6));
            osOut += static_cast<char>(0x80 | (c & 0x3F));
        }
    }
    return osOut;
}

// The bytes of a UTF-8 text (already validated by the parser); false when it
// holds a character beyond U+00FF.
bool Utf8ToBytes(const std::string& osText, std::string* posBytes) {
    for (std::size_t i = 0; i < osText.size(); ++i) {
        const auto c = static_cast<unsigned char>(osText[i]);
        if (c < 0x80) {
            *posBytes += static_cast<char>(c);
        } else if ((c == 0xC2 || c == 0xC3) && i + 1 < osText.size()) {
            const auto c2 = static_cast<unsigned char>(osText[++i]);
            *posBytes += static_cast<char>(((c & 0x03) << 6) | (c2 & 0x3F));
        } else {
            return false;
        }
    }
    return true;
}

const char* NonFiniteText(double dfValue) {
    if (std::isnan(dfValue)) return "NaN";
    return dfValue > 0 ? "Infinity" : "-Infinity";
}

Json DoubleToJson(double dfValue) {
    if (std::isfinite(dfValue)) return Json(dfValue);
    return Json(NonFiniteText(dfValue));
}

std::string HexOf(const uint8_t* pabyBytes, int nCount) {
    bool bAllZero = true;
    for (int i = 0; i < nCount; ++i) bAllZero = bAllZero && pabyBytes[i] == 0;
    if (bAllZero) return "";
    static const char kDigits[] = "0123456789abcdef";
    std::string osHex;
    for (int i = 0; i < nCount; ++i) {
        osHex += kDigits[pabyBytes[i] >> 4];
        osHex += kDigits[pabyBytes[i] & 0x0F];
    }
    return osHex;
}

int HexDigit(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

// Reading: every failure names the file and the field.
struct Reader {
    FieldContext sContext;  // top level: fields are named by their full path

    [[noreturn]] void Fail(const std::string& osField, const std::string& osProblem) const {
        sContext.Fail(osField, osProblem);
    }

    std::int64_t Integer(const Json& value, const std::string& osField, std::int64_t nMin,
                         std::int64_t nMax) const {
        return IntegerValue(value, osField, nMin, nMax, sContext);
    }

    double Number(const Json& value, const std::string& osField) const {
        if (value.is_number()) return value.get<double>();
        if (value.is_string()) {
            const std::string& osText = value.get_ref<const std::string&>();
            if (osText == "NaN") return std::numeric_limits<double>::quiet_NaN();
            if (osText == "Infinity") return std::numeric_limits<double>::infinity();
            if (osText == "-Infinity") return -std::numeric_limits<double>::infinity();
        }
        Fail(osField,
             "must be a number (or \"NaN\", \"Infinity\", \"-Infinity\"), found " + value.dump());
    }

    float Single(const Json& value, const std::string& osField) const {
        const double dfValue = Number(value, osField);
        if (std::isfinite(dfValue) && std::fabs(dfValue) > FLT_MAX) {
            Fail(osField,
                 "is beyond the range of a single-precision number, found " + value.dump());
        }
        return static_cast<float>(dfValue);
    }

    void Text(const Json& value, const std::string& osField, char* pszOut, int nSize) const {
        if (!value.is_string()) Fail(osField, "must be a text, found " + value.dump());
        std::string osBytes;
        if (!Utf8ToBytes(value.get_ref<const std::string&>(), &osBytes)) {
            Fail(osField, "holds a character beyond U+00FF: " + value.dump());
        }
        if (osBytes.find('\0') != std::string::npos) {
            Fail(osField, "holds a NUL character: " + value.dump());
        }
        if (osBytes.size() > static_cast<std::size_t>(nSize - 1)) {
            Fail(osField,
                 "is longer than " + std::to_string(nSize - 1) + " characters: " + value.dump());
        }
        std::memset(pszOut, 0, static_cast<std::size_t>(nSize));
        std::copy(osBytes.begin(), osBytes.end(), pszOut);  // terminated by the memset
    }

    void HexBytes(const Json& value, const std::string& osField, uint8_t* pabyOut,
                  int nCount) const {
        if (!value.is_string())
            Fail(osField, "must be a text of hex digits, found " + value.dump());
        const std::string& osHex = value.get_ref<const std::string&>();
        std::memset(pabyOut, 0, static_cast<std::size_t>(nCount));
        if (osHex.empty()) return;
        if (osHex.size() != 2 * static_cast<std::size_t>(nCount)) {
            Fail(osField, "must hold " + std::to_string(2 * nCount) +
                              " hex digits (or be empty), found " + std::to_string(osHex.size()));
        }
        for (int i = 0; i < nCount; ++i) {
            const int nHigh = HexDigit(osHex[2 * i]);
            const int nLow = HexDigit(osHex[2 * i + 1]);
            if (nHigh < 0 || nLow < 0) {
                Fail(osField, "holds a character that is not a hex digit at position " +
                                  std::to_string(nHigh < 0 ? 2 * i : 2 * i + 1));
            }
            pabyOut[i] = static_cast<uint8_t>(nHigh * 16 + nLow);
        }
    }

    const Json& FixedArray(const Json& value, const std::string& osField, int nCount) const {
        if (!value.is_array()) Fail(osField, "must be an array, found " + value.dump());
        if (value.size() != static_cast<std::size_t>(nCount)) {
            Fail(osField, "must hold " + std::to_string(nCount) + " items, found " +
                              std::to_string(value.size()));
        }
        return value;
    }

    // Stores one value into its field of the record at pvRecord.
    void Field(const Json& value, const FieldSpec& sSpec, const std::string& osField,
               void* pvRecord) const {
        auto* pabyField = static_cast<unsigned char*>(pvRecord) + sSpec.nOffset;
        const std::int64_t kMin32 = std::numeric_limits<int32_t>::min();
        const std::int64_t kMax32 = std::numeric_limits<int32_t>::max();
        switch (sSpec.eKind) {
            case FieldKind::Text:
                Text(value, osField, reinterpret_cast<char*>(pabyField), sSpec.nCount);
                return;
            case FieldKind::Int32: {
                const auto n = static_cast<int32_t>(Integer(value, osField, kMin32, kMax32));
                std::memcpy(pabyField, &n, sizeof(n));
                return;
            }
            case FieldKind::Byte:
                *pabyField = static_cast<uint8_t>(Integer(value, osField, 0, 255));
                return;
            case FieldKind::Double: {
                const double dfValue = Number(value, osField);
                std::memcpy(pabyField, &dfValue, sizeof(dfValue));
                return;
            }
            case FieldKind::Float: {
                const float fValue = Single(value, osField);
                std::memcpy(pabyField, &fValue, sizeof(fValue));
                return;
            }
            case FieldKind::Doubles:
            case FieldKind::Int32s:
            case FieldKind::Bytes:
                Items(FixedArray(value, osField, sSpec.nCount), sSpec, osField, pabyField);
                return;
            case FieldKind::Hex:
                HexBytes(value, osField, pabyField, sSpec.nCount);
                return;
        }
    }

    void Items(const Json& array, const FieldSpec& sSpec, const std::string& osField,
               unsigned char* pabyField) const {
        for (int i = 0; i < sSpec.nCount; ++i) {
            const Json& item = array[static_cast<std::size_t>(i)];
            const std::string osItem = osField + "[" + std::to_string(i) + "]";
            if (sSpec.eKind == FieldKind::Doubles) {
                const double dfValue = Number(item, osItem);
                std::memcpy(pabyField + i * sizeof(double), &dfValue, sizeof(dfValue));
            } else if (sSpec.eKind == FieldKind::Int32s) {
                const auto n =
                    static_cast<int32_t>(Integer(item, osItem, std::numeric_limits<int32_t>::min(),
                                                 std::numeric_limits<int32_t>::max()));
                std::memcpy(pabyField + i * sizeof(int32_t), &n, sizeof(n));
            } else {
                pabyField[i] = static_cast<uint8_t>(Integer(item, osItem, 0, 255));
            }
        }
    }

    // Reads the members of `object` named in the table; any other member
    // except those in pszExtra (null-terminated list) is an error.
    void Object(const Json& object, const std::string& osPrefix,
                std::pair<const FieldSpec*, std::size_t> sTable,
                std::initializer_list<const char*> aosExtra, void* pvRecord) const {
        for (auto it = object.begin(); it != object.end(); ++it) {
            const FieldSpec* psSpec = nullptr;
            for (std::size_t i = 0; i < sTable.second && psSpec == nullptr; ++i) {
                if (it.key() == sTable.first[i].pszName) psSpec = &sTable.first[i];
            }
            if (psSpec != nullptr) {
                Field(it.value(), *psSpec, osPrefix + it.key(), pvRecord);
                continue;
            }
            bool bExtra = false;
            for (const char* pszExtra : aosExtra) bExtra = bExtra || it.key() == pszExtra;
            if (!bExtra) Fail(osPrefix + it.key(), "is not a known field");
        }
    }
};

template <typename Sub, typename Line>
void ReadSubRecord(const Json& object, const SubRecordCodec<Sub, Line>& sCodec,
                   const Reader& sReader, void** ppHolder) {
    const std::string osPrefix = std::string(kOrbitDataName) + ".";
    HostPtr<Sub> poSub(static_cast<Sub*>(HCalloc(1, sizeof(Sub))));
    sReader.Object(object, osPrefix, sCodec.sFields, {sCodec.pszCountName, sCodec.pszLinesName},
                   poSub.get());

    HostPtr<Line> poLines;
    std::size_t nLines = 0;
    const auto itLines = object.find(sCodec.pszLinesName);
    if (itLines != object.end()) {
        const std::string osField = osPrefix + sCodec.pszLinesName;
        if (!itLines->is_array()) sReader.Fail(osField, "must be an array of lines");
        nLines = itLines->size();
        if (nLines > static_cast<std::size_t>(std::numeric_limits<int32_t>::max())) {
            sReader.Fail(osField, "holds more lines than a segment can count");
        }
        if (nLines > 0) poLines.reset(static_cast<Line*>(HCalloc(nLines, sizeof(Line))));
        const std::size_t nColumns = sCodec.sColumns.second;
        for (std::size_t i = 0; i < nLines; ++i) {
            const std::string osLine = osField + "[" + std::to_string(i) + "]";
            const Json& row = (*itLines)[i];
            if (!row.is_array() || row.size() != nColumns) {
                sReader.Fail(osLine, "must be an array of " + std::to_string(nColumns) +
                                         " values, found " + row.dump());
            }
            for (std::size_t k = 0; k < nColumns; ++k) {
                const FieldSpec& sColumn = sCodec.sColumns.first[k];
                sReader.Field(row[k], sColumn, osLine + "." + sColumn.pszName, &poLines.get()[i]);
            }
        }
    }
    const auto itCount = object.find(sCodec.pszCountName);
    if (itCount != object.end()) {
        const std::string osField = osPrefix + sCodec.pszCountName;
        const std::int64_t nCount =
            sReader.Integer(*itCount, osField, 0, std::numeric_limits<int32_t>::max());
        if (static_cast<std::size_t>(nCount) != nLines) {
            sReader.Fail(osField, "is " + std::to_string(nCount) + " but " + sCodec.pszLinesName +
                                      " holds " + std::to_string(nLines) + " lines");
        }
    }
    poSub.get()->*sCodec.pnCount = static_cast<int32_t>(nLines);
    poSub.get()->*sCodec.ppLines = poLines.release();
    *ppHolder = poSub.release();
}

void ReadOrbitData(const Json& object, const Reader& sReader, EphemerisSeg_t* psSeg) {
    if (!object.is_object()) sReader.Fail(kOrbitDataName, "must be a JSON object");
    // The holder is attached first, so the segment's own release frees
    // whatever has been read should a later field fail.
    psSeg->ppOrbitData = static_cast<void**>(HCalloc(1, sizeof(void*)));
    switch (psSeg->nOrbitType) {
        case EPH_ORBIT_ATTITUDE:
            ReadSubRecord(object, kAttitudeCodec, sReader, psSeg->ppOrbitData);
            return;
        case EPH_ORBIT_RADAR:
            ReadSubRecord(object, kRadarCodec, sReader, psSeg->ppOrbitData);
            return;
        case EPH_ORBIT_AVHRR:
            ReadSubRecord(object, kAvhrrCodec, sReader, psSeg->ppOrbitData);
            return;
        default:
            sReader.Fail(kOrbitDataName, "needs \"nOrbitType\" 1, 2 or 3, found " +
                                             std::to_string(psSeg->nOrbitType));
    }
}

void CheckEnvelope(const Json& document, const Reader& sReader) {
    const Json& format = RequireField(document, "format", sReader.sContext);
    if (format != kSegmentFormat) {
        sReader.Fail("format",
                     std::string("must be ") + Quoted(kSegmentFormat) + ", found " + format.dump());
    }
    const Json& version = RequireField(document, "version", sReader.sContext);
    if (sReader.Integer(version, "version", 1, 1000) != kSegmentFormatVersion) {
        sReader.Fail("version", "must be " + std::to_string(kSegmentFormatVersion) + ", found " +
                                    version.dump());
    }
}

// ---------------------------------------------------------------------------
// Writing
// ---------------------------------------------------------------------------

std::string TextOf(const char* pszText, int nSize, const char* pszField) {
    const std::size_t nLength = strnlen(pszText, static_cast<std::size_t>(nSize));
    if (nLength == static_cast<std::size_t>(nSize)) {
        LUMO_CLI_FAIL(std::string("segment field ") + Quoted(pszField) + " fills its " +
                      std::to_string(nSize) + " bytes without a terminator");
    }
    return BytesToUtf8(pszText, nLength);
}

Json FieldToJson(const FieldSpec& sSpec, const void* pvRecord) {
    const auto* pabyField = static_cast<const unsigned char*>(pvRecord) + sSpec.nOffset;
    switch (sSpec.eKind) {
        case FieldKind::Text:
            return TextOf(reinterpret_cast<const char*>(pabyField), sSpec.nCount, sSpec.pszName);
        case FieldKind::Int32: {
            int32_t n = 0;
            std::memcpy(&n, pabyField, sizeof(n));
            return n;
        }
        case FieldKind::Byte:
            return static_cast<int>(*pabyField);
        case FieldKind::Double: {
            double dfValue = 0;
            std::memcpy(&dfValue, pabyField, sizeof(dfValue));
            return DoubleToJson(dfValue);
        }
        case FieldKind::Float: {
            float fValue = 0;
            std::memcpy(&fValue, pabyField, sizeof(fValue));
            return DoubleToJson(fValue);
        }
        case FieldKind::Doubles: {
            Json items = Json::array();
            for (int i = 0; i < sSpec.nCount; ++i) {
                double dfValue = 0;
                std::memcpy(&dfValue, pabyField + i * sizeof(double), sizeof(dfValue));
                items.push_back(DoubleToJson(dfValue));
            }
            return items;
        }
        case FieldKind::Int32s: {
            Json items = Json::array();
            for (int i = 0; i < sSpec.nCount; ++i) {
                int32_t n = 0;
                std::memcpy(&n, pabyField + i * sizeof(int32_t), sizeof(n));
                items.push_back(n);
            }
            return items;
        }
        case FieldKind::Bytes: {
            Json items = Json::array();
            for (int i = 0; i < sSpec.nCount; ++i) items.push_back(static_cast<int>(pabyField[i]));
            return items;
        }
        case FieldKind::Hex:
            return HexOf(pabyField, sSpec.nCount);
    }
    return nullptr;
}

void FieldsToJson(std::pair<const FieldSpec*, std::size_t> sTable, const void* pvRecord,
                  Json* poObject) {
    for (std::size_t i = 0; i < sTable.second; ++i) {
        (*poObject)[sTable.first[i].pszName] = FieldToJson(sTable.first[i], pvRecord);
    }
}

template <typename Sub, typename Line>
Json SubRecordToJson(const void* pvSub, const SubRecordCodec<Sub, Line>& sCodec) {
    const Sub& sSub = *static_cast<const Sub*>(pvSub);
    Json object = Json::object();
    FieldsToJson(sCodec.sFields, &sSub, &object);
    // Only lines that really exist are written, so the file's count always
    // agrees with its table.
    const Line* pasLines = sSub.*sCodec.ppLines;
    const int32_t nLines =
        pasLines != nullptr && sSub.*sCodec.pnCount > 0 ? sSub.*sCodec.pnCount : 0;
    object[sCodec.pszCountName] = nLines;
    Json lines = Json::array();
    for (int32_t i = 0; i < nLines; ++i) {
        Json row = Json::array();
        for (std::size_t k = 0; k < sCodec.sColumns.second; ++k) {
            row.push_back(FieldToJson(sCodec.sColumns.first[k], &pasLines[i]));
        }
        lines.push_back(std::move(row));
    }
    object[sCodec.pszLinesName] = std::move(lines);
    return object;
}

// The sub-record as a JSON object; null when the segment has none to write.
Json OrbitDataToJson(const EphemerisSeg_t& sSeg) {
    const void* pvSub = sSeg.ppOrbitData != nullptr ? *sSeg.ppOrbitData : nullptr;
    if (pvSub == nullptr) return nullptr;
    switch (sSeg.nOrbitType) {
        case EPH_ORBIT_ATTITUDE:
            return SubRecordToJson(pvSub, kAttitudeCodec);
        case EPH_ORBIT_RADAR:
            return SubRecordToJson(pvSub, kRadarCodec);
        case EPH_ORBIT_AVHRR:
            return SubRecordToJson(pvSub, kAvhrrCodec);
        default:
            return nullptr;
    }
}

// Pretty form with one line per array of plain values, so that a line table
// takes one text line per image line.
bool IsFlatArray(const Json& value) {
    if (!value.is_array()) return false;
    for (const Json& item : value) {
        if (item.is_structured()) return false;
    }
    return true;
}

void AppendFormatted(const Json& value, int nIndent, std::string* posOut) {
    const std::string osPad(static_cast<std::size_t>(nIndent) + 2, ' ');
    if (value.is_object() && !value.empty()) {
        *posOut += "{\n";
        std::size_t i = 0;
        for (auto it = value.begin(); it != value.end(); ++it, ++i) {
            *posOut += osPad + Json(it.key()).dump() + ": ";
            AppendFormatted(it.value(), nIndent + 2, posOut);
            *posOut += (i + 1 < value.size() ? ",\n" : "\n");
        }
        *posOut += std::string(static_cast<std::size_t>(nIndent), ' ') + "}";
    } else if (value.is_array() && !value.empty() && !IsFlatArray(value)) {
        *posOut += "[\n";
        for (std::size_t i = 0; i < value.size(); ++i) {
            *posOut += osPad;
            AppendFormatted(value[i], nIndent + 2, posOut);
            *posOut += (i + 1 < value.size() ? ",\n" : "\n");
        }
        *posOut += std::string(static_cast<std::size_t>(nIndent), ' ') + "]";
    } else if (value.is_array()) {
        *posOut += "[";
        for (std::size_t i = 0; i < value.size(); ++i) {
            *posOut += (i == 0 ? "" : ", ") + value[i].dump();
        }
        *posOut += "]";
    } else {
        *posOut += value.dump();
    }
}

}  // namespace

SegmentPtr SegmentFromJson(const Json& document, const std::string& source) {
    const Reader sReader{FieldContext{source, ""}};
    if (!document.is_object()) LUMO_CLI_FAIL(source + ": a segment file must hold a JSON object");
    CheckEnvelope(document, sReader);
    SegmentPtr poSeg(static_cast<EphemerisSeg_t*>(HCalloc(1, sizeof(EphemerisSeg_t))));
    sReader.Object(document, "", Table(kSegmentFields), {"format", "version", kOrbitDataName},
                   poSeg.get());
    const auto itOrbit = document.find(kOrbitDataName);
    if (itOrbit != document.end() && !itOrbit->is_null()) {
        ReadOrbitData(*itOrbit, sReader, poSeg.get());
    }
    const std::string problem = EphemerisSegValidate(poSeg.get());
    if (!problem.empty()) LUMO_CLI_FAIL(source + ": the segment cannot be used: " + problem);
    return poSeg;
}

SegmentPtr ReadSegmentFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    if (!in) LUMO_CLI_FAIL(path + ": cannot open segment file");
    Json document;
    try {
        document = Json::parse(in);
    } catch (const Json::parse_error& e) {
        LUMO_CLI_FAIL(path + ": not valid JSON: " + e.what());
    }
    return SegmentFromJson(document, path);
}

Json SegmentToJson(const EphemerisSeg_t& segment) {
    Json document = Json::object();
    document["format"] = kSegmentFormat;
    document["version"] = kSegmentFormatVersion;
    FieldsToJson(Table(kSegmentFields), &segment, &document);
    Json orbit = OrbitDataToJson(segment);
    if (!orbit.is_null()) document[kOrbitDataName] = std::move(orbit);
    return document;
}

std::string FormatSegmentJson(const Json& document) {
    std::string osOut;
    AppendFormatted(document, 0, &osOut);
    return osOut + "\n";
}

void WriteSegmentFile(const std::string& path, const EphemerisSeg_t& segment) {
    WriteFileReplacing(path, FormatSegmentJson(SegmentToJson(segment)));
}

std::string DescribeSegment(const EphemerisSeg_t& segment) {
    static const char* const kKinds[] = {"none", "attitude", "radar", "AVHRR"};
    EphemerisSeg_t sCopy = segment;  // GetSensor takes a non-const record
    const int nSensor = GetSensor(&sCopy);
    std::ostringstream os;
    const std::string osName = BufferText(segment.szSensorName, sizeof(segment.szSensorName));
    os << "sensor: " << Quoted(osName) << ", sensor code " << nSensor << ", model class "
       << GetModel(nSensor) << '\n';
    os << "image: " << segment.nNumPixels << " pixels x " << segment.nNumLines << " lines";
    os << ", pixel " << segment.dfPixelRes << " m, line " << segment.dfLineRes << " m\n";
    const std::string osGeosys = BufferText(segment.szGeosys, EPH_GEOSYS_SIZE);
    const std::string osDate = BufferText(segment.szAcquisitionDate, EPH_DATE_SIZE);
    os << "acquired: " << Quoted(osDate) << ", georeferencing " << Quoted(osGeosys) << '\n';
    const int nKind = segment.nOrbitType;
    os << "orbit data: kind " << nKind;
    if (nKind >= 0 && nKind <= 3) os << " (" << kKinds[nKind] << ")";
    const Json orbit = OrbitDataToJson(segment);
    if (!orbit.is_null()) {
        for (const char* pszCount : {"nNumAttitudeLines", "nNumLinePositions", "nNumScanLines"}) {
            if (orbit.contains(pszCount)) os << ", " << orbit[pszCount].get<int>() << " lines";
        }
    } else if (nKind != 0) {
        os << ", no sub-record";
    }
    os << '\n';
    if (segment.nLevelConvForm != 0) {
        os << "level 1A/1B conversion: " << segment.nLevelConvForm << " terms\n";
    }
    return os.str();
}

}  // namespace lumo::cli
