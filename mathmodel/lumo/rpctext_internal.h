// What the readers and writers of the RPC text forms share: the ten
// normalisation values and four coefficient lists under each form's keys,
// the values a text gives, where each came from for messages, and the small
// text helpers both sides use.
#pragma once

#include <array>
#include <string>
#include <vector>

#include "lumo_rf.h"
#include "runtime.h"

// A data error naming where a text went wrong; file and function are the
// throwing line's.
#define RPC_FAIL(message) throw nova::DataException((message), __FILE__, __func__, __LINE__)

namespace lumo {
namespace rpctext {

// The ten normalisation values, in the order of the text forms.
enum Scalar {
    kLineOff,
    kSampOff,
    kLatOff,
    kLongOff,
    kHeightOff,
    kLineScale,
    kSampScale,
    kLatScale,
    kLongScale,
    kHeightScale,
    kScalarCount
};
inline constexpr std::array<const char*, kScalarCount> kTxtScalarKeys = {
    "LINE_OFF",   "SAMP_OFF",   "LAT_OFF",   "LONG_OFF",   "HEIGHT_OFF",
    "LINE_SCALE", "SAMP_SCALE", "LAT_SCALE", "LONG_SCALE", "HEIGHT_SCALE"};
inline constexpr std::array<const char*, kScalarCount> kRpbScalarKeys = {
    "lineOffset", "sampOffset", "latOffset", "longOffset", "heightOffset",
    "lineScale",  "sampScale",  "latScale",  "longScale",  "heightScale"};
inline constexpr std::array<const char*, kScalarCount> kUnits = {
    "pixels", "pixels", "degrees", "degrees", "meters",
    "pixels", "pixels", "degrees", "degrees", "meters"};

// The four coefficient lists.
enum List { kLineNum, kLineDen, kSampNum, kSampDen, kListCount };
inline constexpr std::array<const char*, kListCount> kTxtListPrefixes = {
    "LINE_NUM_COEFF_", "LINE_DEN_COEFF_", "SAMP_NUM_COEFF_", "SAMP_DEN_COEFF_"};
inline constexpr std::array<const char*, kListCount> kRpbListKeys = {"lineNumCoef", "lineDenCoef",
                                                                     "sampNumCoef", "sampDenCoef"};

// Everything a text gives, with the line each value came from (0: not yet).
struct RpcValues {
    std::array<double, kScalarCount> adfScalar{};
    std::array<int, kScalarCount> anScalarLine{};
    std::array<std::array<double, RF_MAX_TERMS>, kListCount> aadfCoeff{};
    std::array<std::array<int, RF_MAX_TERMS>, kListCount> aanCoeffLine{};
    std::string osSensor;
    std::vector<LumoRPCField> aoFields;  // everything else, in file order
};

// Fields both text forms carry under different names: the error estimates
// (metres).
struct FieldSpelling {
    const char* pszTxt;
    const char* pszRpb;
};
inline constexpr FieldSpelling kFieldSpellings[] = {{"ERR_BIAS", "errBias"},
                                                    {"ERR_RAND", "errRand"}};

// Where a value came from, for messages.
struct Origin {
    const std::string& osSource;
    int nLine;
    std::string osKey;
    std::string osPlace = std::string();  // where, when not a line ("characters 16-21")

    std::string Prefix() const {
        return osSource + ": " + (osPlace.empty() ? "line " + std::to_string(nLine) : osPlace) +
               ": key \"" + osKey + "\"";
    }
};

bool EqualNoCase(const std::string& a, const char* b);
bool StartsWithNoCase(const std::string& a, const char* b);
std::string Trim(const std::string& osText);
// Printable form of a value for messages: long or binary texts are cut.
std::string Shown(const std::string& osText);
std::vector<std::string> SplitLines(const std::string& osText);

// A "name = value;" statement is complete: it ends with ';', or with the end
// of a line outside a "( ... )" list.
bool StatementComplete(const std::string& osStatement);

// The record's characters of a fixed-width text, and whether they look like
// one.
std::string FixedRecord(const std::string& osText);
bool LooksFixed(const std::string& osRecord);

// The three readers; each throws a data error naming the source, the line (or
// characters) and the key of the first bad value.
RpcValues ReadTxt(const std::string& osText, const std::string& osSource);
RpcValues ReadRpb(const std::string& osText, const std::string& osSource);
RpcValues ReadFixed(const std::string& osText, const std::string& osSource);

}  // namespace rpctext
}  // namespace lumo
