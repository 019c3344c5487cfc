// RPC00B text forms of a rational function model: the "KEY: value" lines of
// *_RPC.TXT files, the "name = value;" statements of .RPB files and the
// fixed-width record of RPC-*.txt files. All carry ten normalisation values
// and four lists of 20 coefficients, with longitude, latitude and height on
// the ground side and line and sample on the image side. RPC sample and line
// 0 are the centre of the first pixel, which is what the model's half-pixel
// shift expresses. Every other field of a text (error estimates, names) is
// handed back beside the record, so conversions keep it.
#include <algorithm>
#include <array>
#include <cctype>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "lumo_rf.h"
#include "projection.h"
#include "runtime.h"

namespace {

#define RPC_FAIL(message) throw nova::DataException((message), __FILE__, __func__, __LINE__)

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
constexpr std::array<const char*, kScalarCount> kTxtScalarKeys = {
    "LINE_OFF",   "SAMP_OFF",   "LAT_OFF",   "LONG_OFF",   "HEIGHT_OFF",
    "LINE_SCALE", "SAMP_SCALE", "LAT_SCALE", "LONG_SCALE", "HEIGHT_SCALE"};
constexpr std::array<const char*, kScalarCount> kRpbScalarKeys = {
    "lineOffset", "sampOffset", "latOffset", "longOffset", "heightOffset",
    "lineScale",  "sampScale",  "latScale",  "longScale",  "heightScale"};
constexpr std::array<const char*, kScalarCount> kUnits = {"pixels",  "pixels", "degrees", "degrees",
                                                          "meters",  "pixels", "pixels",  "degrees",
                                                          "degrees", "meters"};

// The four coefficient lists.
enum List { kLineNum, kLineDen, kSampNum, kSampDen, kListCount };
constexpr std::array<const char*, kListCount> kTxtListPrefixes = {
    "LINE_NUM_COEFF_", "LINE_DEN_COEFF_", "SAMP_NUM_COEFF_", "SAMP_DEN_COEFF_"};
constexpr std::array<const char*, kListCount> kRpbListKeys = {"lineNumCoef", "lineDenCoef",
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
constexpr FieldSpelling kFieldSpellings[] = {{"ERR_BIAS", "errBias"}, {"ERR_RAND", "errRand"}};

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

bool IsBlank(char ch) {
    return ch == ' ' || ch == '\t' || ch == '\r' || ch == '\n';
}

std::string Trim(const std::string& osText) {
    std::size_t nStart = 0;
    std::size_t nEnd = osText.size();
    while (nStart < nEnd && IsBlank(osText[nStart])) ++nStart;
    while (nEnd > nStart && IsBlank(osText[nEnd - 1])) --nEnd;
    return osText.substr(nStart, nEnd - nStart);
}

bool EqualNoCase(const std::string& a, const char* b) {
    const std::size_t n = std::strlen(b);
    if (a.size() != n) return false;
    for (std::size_t i = 0; i < n; ++i) {
        if (std::tolower(static_cast<unsigned char>(a[i])) !=
            std::tolower(static_cast<unsigned char>(b[i]))) {
            return false;
        }
    }
    return true;
}

bool StartsWithNoCase(const std::string& a, const char* b) {
    const std::size_t n = std::strlen(b);
    return a.size() >= n && EqualNoCase(a.substr(0, n), b);
}

// Printable form of a value for messages: long or binary texts are cut.
std::string Shown(const std::string& osText) {
    constexpr std::size_t kMaxShown = 60;
    std::string osShown;
    for (char ch : osText.substr(0, kMaxShown)) {
        osShown += std::isprint(static_cast<unsigned char>(ch)) ? ch : '?';
    }
    if (osText.size() > kMaxShown) osShown += "...";
    return "\"" + osShown + "\"";
}

// A whole token as a finite decimal number.
double ParseNumber(const std::string& osToken, const Origin& origin) {
    const char* pszStart = osToken.c_str();
    char* pszEnd = nullptr;
    const double dfValue = osToken.empty() ? 0.0 : std::strtod(pszStart, &pszEnd);
    if (osToken.empty() || pszEnd != pszStart + osToken.size()) {
        RPC_FAIL(origin.Prefix() + ": " + Shown(osToken) + " is not a number");
    }
    if (!std::isfinite(dfValue)) {
        RPC_FAIL(origin.Prefix() + ": " + Shown(osToken) + " is not a finite number");
    }
    return dfValue;
}

std::vector<std::string> SplitLines(const std::string& osText) {
    std::vector<std::string> aosLines;
    std::size_t nStart = 0;
    while (nStart <= osText.size()) {
        const std::size_t nEnd = osText.find('\n', nStart);
        if (nEnd == std::string::npos) {
            aosLines.push_back(osText.substr(nStart));
            break;
        }
        aosLines.push_back(osText.substr(nStart, nEnd - nStart));
        nStart = nEnd + 1;
    }
    return aosLines;
}

void StoreScalar(RpcValues& values, int nIndex, double dfValue, const Origin& origin) {
    if (values.anScalarLine[nIndex] != 0) {
        RPC_FAIL(origin.Prefix() + ": repeated (first given on line " +
                 std::to_string(values.anScalarLine[nIndex]) + ")");
    }
    const bool bScale = nIndex >= kLineScale;
    if (bScale && dfValue == 0.0) RPC_FAIL(origin.Prefix() + ": a scale must not be 0");
    values.adfScalar[nIndex] = dfValue;
    values.anScalarLine[nIndex] = origin.nLine;
}

void StoreCoefficient(RpcValues& values, int nList, int nTerm, double dfValue,
                      const Origin& origin) {
    if (values.aanCoeffLine[nList][nTerm] != 0) {
        RPC_FAIL(origin.Prefix() + ": repeated (first given on line " +
                 std::to_string(values.aanCoeffLine[nList][nTerm]) + ")");
    }
    values.aadfCoeff[nList][nTerm] = dfValue;
    values.aanCoeffLine[nList][nTerm] = origin.nLine;
}

// Every value must have been given.
void RequireComplete(const RpcValues& values, const std::string& osSource, bool bTxt) {
    for (int k = 0; k < kScalarCount; ++k) {
        if (values.anScalarLine[k] == 0) {
            RPC_FAIL(osSource + ": key \"" + (bTxt ? kTxtScalarKeys[k] : kRpbScalarKeys[k]) +
                     "\" is missing");
        }
    }
    for (int nList = 0; nList < kListCount; ++nList) {
        for (int i = 0; i < RF_MAX_TERMS; ++i) {
            if (values.aanCoeffLine[nList][i] != 0) continue;
            std::string osKey = bTxt ? kTxtListPrefixes[nList] : kRpbListKeys[nList];
            if (bTxt) osKey += std::to_string(i + 1);
            std::string osMessage = osSource;
            osMessage.append(": key \"").append(osKey).append("\" is missing");
            RPC_FAIL(osMessage);
        }
    }
}

// ---------------------------------------------------------------------------
// KEY: value
// ---------------------------------------------------------------------------

// "number [unit]": a unit word after the number is allowed and not checked
// against the key, as vendors spell units differently.
double ParseTxtValue(const std::string& osValue, const Origin& origin) {
    const std::size_t nBlank = osValue.find_first_of(" \t");
    if (nBlank == std::string::npos) return ParseNumber(osValue, origin);
    const std::string osUnit = Trim(osValue.substr(nBlank));
    for (char ch : osUnit) {
        if (!std::isalpha(static_cast<unsigned char>(ch))) {
            RPC_FAIL(origin.Prefix() + ": " + Shown(osValue) +
                     " is not a number followed by a unit");
        }
    }
    return ParseNumber(osValue.substr(0, nBlank), origin);
}

// Index 1..20 after a coefficient key's prefix.
int ParseTermIndex(const std::string& osDigits, const Origin& origin) {
    bool bDigits = !osDigits.empty() && osDigits.size() <= 2;
    for (char ch : osDigits) bDigits = bDigits && std::isdigit(static_cast<unsigned char>(ch));
    const int nIndex = bDigits ? std::atoi(osDigits.c_str()) : 0;
    if (nIndex < 1 || nIndex > RF_MAX_TERMS) {
        RPC_FAIL(origin.Prefix() + ": coefficient number must lie in 1..20");
    }
    return nIndex - 1;
}

void ReadTxtLine(const std::string& osLine, int nLine, const std::string& osSource,
                 RpcValues& values) {
    const std::size_t nColon = osLine.find(':');
    if (nColon == std::string::npos) {
        RPC_FAIL(osSource + ": line " + std::to_string(nLine) +
                 ": expected \"KEY: value\", found " + Shown(osLine));
    }
    const Origin origin{osSource, nLine, Trim(osLine.substr(0, nColon))};
    const std::string osValue = Trim(osLine.substr(nColon + 1));
    for (int k = 0; k < kScalarCount; ++k) {
        if (EqualNoCase(origin.osKey, kTxtScalarKeys[k])) {
            StoreScalar(values, k, ParseTxtValue(osValue, origin), origin);
            return;
        }
    }
    for (int nList = 0; nList < kListCount; ++nList) {
        if (StartsWithNoCase(origin.osKey, kTxtListPrefixes[nList])) {
            const int nTerm =
                ParseTermIndex(origin.osKey.substr(std::strlen(kTxtListPrefixes[nList])), origin);
            StoreCoefficient(values, nList, nTerm, ParseTxtValue(osValue, origin), origin);
            return;
        }
    }
    // The error estimates are numbers with a unit; other keys are kept as
    // written.
    for (const FieldSpelling& sSpelling : kFieldSpellings) {
        if (!EqualNoCase(origin.osKey, sSpelling.pszTxt)) continue;
        const std::size_t nBlank = osValue.find_first_of(" \t");
        ParseTxtValue(osValue, origin);
        values.aoFields.push_back({origin.osKey, osValue.substr(0, nBlank), false});
        return;
    }
    // Names are written in quotes by the statement form.
    char* pszEnd = nullptr;
    std::strtod(osValue.c_str(), &pszEnd);
    const bool bNumber = !osValue.empty() && *pszEnd == '\0';
    if (EqualNoCase(origin.osKey, "satId")) values.osSensor = osValue;
    values.aoFields.push_back({origin.osKey, osValue, !bNumber});
}

RpcValues ReadTxt(const std::string& osText, const std::string& osSource) {
    RpcValues values;
    const std::vector<std::string> aosLines = SplitLines(osText);
    for (std::size_t i = 0; i < aosLines.size(); ++i) {
        const std::string osLine = Trim(aosLines[i]);
        if (osLine.empty()) continue;
        ReadTxtLine(osLine, static_cast<int>(i + 1), osSource, values);
    }
    RequireComplete(values, osSource, true);
    return values;
}

// ---------------------------------------------------------------------------
// name = value;
// ---------------------------------------------------------------------------

// The items of "( a, b, ... )".
std::vector<std::string> SplitList(const std::string& osValue, const Origin& origin) {
    if (osValue.size() < 2 || osValue.front() != '(' || osValue.back() != ')') {
        RPC_FAIL(origin.Prefix() + ": expected a list \"( ..., ... )\", found " + Shown(osValue));
    }
    std::vector<std::string> aosItems;
    const std::string osInner = osValue.substr(1, osValue.size() - 2);
    std::size_t nStart = 0;
    while (true) {
        const std::size_t nComma = osInner.find(',', nStart);
        aosItems.push_back(Trim(osInner.substr(nStart, nComma - nStart)));
        if (nComma == std::string::npos) break;
        nStart = nComma + 1;
    }
    return aosItems;
}

std::string Unquote(const std::string& osValue) {
    if (osValue.size() >= 2 && osValue.front() == '"' && osValue.back() == '"') {
        return osValue.substr(1, osValue.size() - 2);
    }
    return osValue;
}

void ReadRpbStatement(const std::string& osStatement, int nLine, const std::string& osSource,
                      RpcValues& values) {
    const std::size_t nEquals = osStatement.find('=');
    if (nEquals == std::string::npos) {
        RPC_FAIL(osSource + ": line " + std::to_string(nLine) +
                 ": expected \"name = value;\", found " + Shown(osStatement));
    }
    const Origin origin{osSource, nLine, Trim(osStatement.substr(0, nEquals))};
    // A ';' ending the statement is not part of the value.
    std::string osValue = Trim(osStatement.substr(nEquals + 1));
    if (!osValue.empty() && osValue.back() == ';')
        osValue = Trim(osValue.substr(0, osValue.size() - 1));
    for (int k = 0; k < kScalarCount; ++k) {
        if (EqualNoCase(origin.osKey, kRpbScalarKeys[k])) {
            StoreScalar(values, k, ParseNumber(osValue, origin), origin);
            return;
        }
    }
    for (int nList = 0; nList < kListCount; ++nList) {
        if (!EqualNoCase(origin.osKey, kRpbListKeys[nList])) continue;
        const std::vector<std::string> aosItems = SplitList(osValue, origin);
        if (aosItems.size() != RF_MAX_TERMS) {
            RPC_FAIL(origin.Prefix() + ": must hold 20 coefficients, found " +
                     std::to_string(aosItems.size()));
        }
        for (int i = 0; i < RF_MAX_TERMS; ++i) {
            StoreCoefficient(values, nList, i, ParseNumber(aosItems[i], origin), origin);
        }
        return;
    }
    if (EqualNoCase(origin.osKey, "satId")) values.osSensor = Unquote(osValue);
    values.aoFields.push_back({origin.osKey, Unquote(osValue), Unquote(osValue) != osValue});
}

// Group brackets and the closing "END;" carry no values.
bool IsStructureLine(const std::string& osLine) {
    return StartsWithNoCase(osLine, "BEGIN_GROUP") || StartsWithNoCase(osLine, "END_GROUP") ||
           EqualNoCase(osLine, "END;") || EqualNoCase(osLine, "END");
}

// A statement ends with ';', or, as some producers write them, with the end
// of a line outside a "( ... )" list (brackets inside quotes do not count).
bool StatementComplete(const std::string& osStatement) {
    if (osStatement.back() == ';') return true;
    int nDepth = 0;
    bool bQuoted = false;
    for (char ch : osStatement) {
        if (ch == '"') bQuoted = !bQuoted;
        if (!bQuoted) nDepth += ch == '(' ? 1 : ch == ')' ? -1 : 0;
    }
    return nDepth <= 0;
}

RpcValues ReadRpb(const std::string& osText, const std::string& osSource) {
    RpcValues values;
    const std::vector<std::string> aosLines = SplitLines(osText);
    std::string osStatement;
    int nStatementLine = 0;
    for (std::size_t i = 0; i < aosLines.size(); ++i) {
        const std::string osLine = Trim(aosLines[i]);
        if (osLine.empty()) continue;
        if (osStatement.empty()) {
            if (IsStructureLine(osLine)) continue;
            nStatementLine = static_cast<int>(i + 1);
        } else {
            osStatement += ' ';
        }
        osStatement += osLine;
        if (StatementComplete(osStatement)) {
            ReadRpbStatement(osStatement, nStatementLine, osSource, values);
            osStatement.clear();
        }
    }
    if (!osStatement.empty()) {
        RPC_FAIL(osSource + ": line " + std::to_string(nStatementLine) +
                 ": list not closed by \")\": " + Shown(osStatement));
    }
    RequireComplete(values, osSource, false);
    return values;
}

// ---------------------------------------------------------------------------
// Fixed-width record (RPC-*.txt): the RPC00B field layout without names,
// optionally led by the validity flag and the two error estimates
// ---------------------------------------------------------------------------

constexpr std::array<std::size_t, kScalarCount> kFixedScalarWidths = {6, 5, 8, 9, 5, 6, 5, 8, 9, 5};
constexpr std::size_t kFixedCoeffWidth = 12;
constexpr std::size_t kFixedBody = 66 + kListCount * RF_MAX_TERMS * kFixedCoeffWidth;
constexpr std::size_t kFixedLead = 15;  // SUCCESS (1), ERR_BIAS (7), ERR_RAND (7)

// The record's characters: line ends removed, trailing blanks cut.
std::string FixedRecord(const std::string& osText) {
    std::string osRecord;
    for (char ch : osText) {
        if (ch != '\r' && ch != '\n') osRecord += ch;
    }
    while (!osRecord.empty() && IsBlank(osRecord.back())) osRecord.pop_back();
    return osRecord;
}

// Only the characters of fixed-width numbers: no keys, no separators.
bool LooksFixed(const std::string& osRecord) {
    return !osRecord.empty() &&
           osRecord.find_first_not_of("0123456789+-.Ee \t") == std::string::npos;
}

// The number in the field at nStart, named after its key in messages.
double FixedField(const std::string& osRecord, std::size_t nStart, std::size_t nWidth,
                  const std::string& osKey, const std::string& osSource) {
    const Origin origin{
        osSource, 1, osKey,
        "characters " + std::to_string(nStart + 1) + "-" + std::to_string(nStart + nWidth)};
    return ParseNumber(Trim(osRecord.substr(nStart, nWidth)), origin);
}

RpcValues ReadFixed(const std::string& osText, const std::string& osSource) {
    const std::string osRecord = FixedRecord(osText);
    if (osRecord.size() != kFixedBody && osRecord.size() != kFixedBody + kFixedLead) {
        RPC_FAIL(osSource + ": a fixed-width RPC record has " + std::to_string(kFixedBody) +
                 " or " + std::to_string(kFixedBody + kFixedLead) +
                 " characters (line ends aside), found " + std::to_string(osRecord.size()));
    }
    RpcValues values;
    std::size_t nPos = 0;
    if (osRecord.size() == kFixedBody + kFixedLead) {
        if (osRecord[0] != '1') {
            RPC_FAIL(osSource + ": character 1: the validity flag is " +
                     Shown(osRecord.substr(0, 1)) +
                     "; the producer marks these coefficients as not usable");
        }
        for (int i = 0; i < 2; ++i) {
            const char* pszKey = kFieldSpellings[i].pszTxt;
            const std::size_t nStart = 1 + 7 * static_cast<std::size_t>(i);
            FixedField(osRecord, nStart, 7, pszKey, osSource);
            values.aoFields.push_back({pszKey, Trim(osRecord.substr(nStart, 7)), false});
        }
        nPos = kFixedLead;
    }
    for (int k = 0; k < kScalarCount; ++k) {
        const Origin origin{osSource, 1, kTxtScalarKeys[k]};
        StoreScalar(values, k,
                    FixedField(osRecord, nPos, kFixedScalarWidths[k], kTxtScalarKeys[k], osSource),
                    origin);
        nPos += kFixedScalarWidths[k];
    }
    for (int nList = 0; nList < kListCount; ++nList) {
        for (int i = 0; i < RF_MAX_TERMS; ++i) {
            const std::string osKey = kTxtListPrefixes[nList] + std::to_string(i + 1);
            const Origin origin{osSource, 1, osKey};
            StoreCoefficient(values, nList, i,
                             FixedField(osRecord, nPos, kFixedCoeffWidth, osKey, osSource), origin);
            nPos += kFixedCoeffWidth;
        }
    }
    return values;
}

// ---------------------------------------------------------------------------
// Record
// ---------------------------------------------------------------------------

// The record when it can be evaluated; else it is released and the reason
// thrown, naming the record field.
RFInfo_t* CheckedRecord(RFInfo_t* psRF, const std::string& osSource) {
    const std::string osProblem = RFValidate(psRF);
    if (osProblem.empty()) return psRF;
    RFDeallocate(psRF);
    RPC_FAIL(osSource + ": the model cannot be evaluated: " + osProblem);
}

RFInfo_t* ValuesToRecord(const RpcValues& values) {
    std::unique_ptr<RFInfo_t, void (*)(RFInfo_t*)> psRF(RFAllocate(nullptr, RF_MAX_TERMS),
                                                        &RFDeallocate);
    psRF->dfXOffset = values.adfScalar[kLongOff];
    psRF->dfXScale = values.adfScalar[kLongScale];
    psRF->dfYOffset = values.adfScalar[kLatOff];
    psRF->dfYScale = values.adfScalar[kLatScale];
    psRF->dfZOffset = values.adfScalar[kHeightOff];
    psRF->dfZScale = values.adfScalar[kHeightScale];
    psRF->dfPixelOffset = values.adfScalar[kSampOff];
    psRF->dfPixelScale = values.adfScalar[kSampScale];
    psRF->dfLineOffset = values.adfScalar[kLineOff];
    psRF->dfLineScale = values.adfScalar[kLineScale];
    for (int i = 0; i < RF_MAX_TERMS; ++i) {
        psRF->padfPixelNum[i] = values.aadfCoeff[kSampNum][i];
        psRF->padfPixelDen[i] = values.aadfCoeff[kSampDen][i];
        psRF->padfLineNum[i] = values.aadfCoeff[kLineNum][i];
        psRF->padfLineDen[i] = values.aadfCoeff[kLineDen][i];
    }
    // The sensor buffer holds 16 characters; a longer name is cut.
    const std::size_t nCopy = std::min<std::size_t>(values.osSensor.size(), RF_TEXT_SIZE - 1);
    std::memcpy(psRF->pszSensor, values.osSensor.data(), nCopy);
    psRF->pszSensor[nCopy] = '\0';
    return psRF.release();
}

#define RPC_REFUSE(message)                                                                 \
    throw nova::DataException(std::string("cannot write RPC text: ") + (message), __FILE__, \
                              __func__, __LINE__)

std::string BoundedText(const char* pszText) {
    if (pszText == nullptr) return std::string();
    return std::string(pszText, strnlen(pszText, RF_TEXT_SIZE - 1));
}

void CheckFinite(double dfValue, const char* pszField) {
    if (!std::isfinite(dfValue)) {
        RPC_REFUSE(std::string(pszField) + " = " + nova::FormatString("%g", dfValue) +
                   " is not finite");
    }
}

// True when the pixel and line share one denominator over the terms in use.
bool SameDenominators(const RFInfo_t* psRF) {
    for (int i = 0; i < psRF->nTerms; ++i) {
        if (psRF->padfPixelDen[i] != psRF->padfLineDen[i]) return false;
    }
    return true;
}

// Folds an image-space adjustment in force into the RPC values. With the
// rational functions' p = SampOff + SampScale Np/Dp (and l likewise), an
// affine adjustment pixel = a0 + (1 + a1) p + a2 l is again a rational
// function: a new offset and, without the cross term a2, a new scale. The
// cross term adds l's Nl/Dl to the pixel's numerator, which needs the line's
// denominator to be the pixel's. The adjustment's constant carries the
// half-pixel shift while RPC positions are centre-based, hence the 0.5.
// Second-order terms have no rational equivalent of third degree.
void FoldAdjustment(const RFInfo_t* psRF, RpcValues& values) {
    const double* a = psRF->adfPixelAdjust;
    const double* b = psRF->adfLineAdjust;
    for (int k = 3; k < RF_ADJUST_TERMS; ++k) {
        if (a[k] != 0.0 || b[k] != 0.0) {
            RPC_REFUSE("the second-order image-space adjustment has no RPC equivalent");
        }
    }
    const bool bCross = a[2] != 0.0 || b[1] != 0.0;
    if (bCross && !SameDenominators(psRF)) {
        RPC_REFUSE(
            "the image-space adjustment mixes pixel and line while their denominators "
            "differ: no RPC equivalent");
    }
    const double Op = psRF->dfPixelOffset, Sp = psRF->dfPixelScale;
    const double Ol = psRF->dfLineOffset, Sl = psRF->dfLineScale;
    values.adfScalar[kSampOff] = (1.0 + a[1]) * Op + a[2] * Ol + a[0] - 0.5;
    values.adfScalar[kLineOff] = b[1] * Op + (1.0 + b[2]) * Ol + b[0] - 0.5;
    if (!bCross) {
        values.adfScalar[kSampScale] = (1.0 + a[1]) * Sp;
        values.adfScalar[kLineScale] = (1.0 + b[2]) * Sl;
        return;
    }
    auto& sampNum = values.aadfCoeff[kSampNum];
    auto& lineNum = values.aadfCoeff[kLineNum];
    for (int i = 0; i < std::max(psRF->nTerms, 0); ++i) {
        const double dfPixelPart = Sp * psRF->padfPixelNum[i];
        const double dfLinePart = Sl * psRF->padfLineNum[i];
        sampNum[i] = ((1.0 + a[1]) * dfPixelPart + a[2] * dfLinePart) / Sp;
        lineNum[i] = (b[1] * dfPixelPart + (1.0 + b[2]) * dfLinePart) / Sl;
    }
}

// The record as RPC values; refuses what the text forms cannot express.
RpcValues RecordToValues(const RFInfo_t* psRF) {
    if (psRF == nullptr || psRF->padfPixelNum == nullptr || psRF->padfPixelDen == nullptr ||
        psRF->padfLineNum == nullptr || psRF->padfLineDen == nullptr) {
        RPC_REFUSE("the model or its coefficient arrays are null");
    }
    if (psRF->nTerms > RF_MAX_TERMS) {
        RPC_REFUSE("nTerms = " + std::to_string(psRF->nTerms) + " exceeds 20");
    }
    const std::string osGeosys = BoundedText(psRF->pszGeosys);
    if (DecodeGeosys(osGeosys.c_str(), nullptr) != NOVA_PROJ_GEOGRAPHIC) {
        RPC_REFUSE("ground coordinates \"" + osGeosys + "\" are not longitude and latitude");
    }
    RpcValues values;
    // Without the half-pixel shift the model's pixel 0 is the first pixel's
    // centre already; RPC positions are centre-based, so move the offsets.
    const double dfShift = psRF->nHalfPixelShift ? 0.0 : -0.5;
    values.adfScalar[kLongOff] = psRF->dfXOffset;
    values.adfScalar[kLongScale] = psRF->dfXScale;
    values.adfScalar[kLatOff] = psRF->dfYOffset;
    values.adfScalar[kLatScale] = psRF->dfYScale;
    values.adfScalar[kHeightOff] = psRF->dfZOffset;
    values.adfScalar[kHeightScale] = psRF->dfZScale;
    values.adfScalar[kSampOff] = psRF->dfPixelOffset + dfShift;
    values.adfScalar[kSampScale] = psRF->dfPixelScale;
    values.adfScalar[kLineOff] = psRF->dfLineOffset + dfShift;
    values.adfScalar[kLineScale] = psRF->dfLineScale;
    // Terms beyond nTerms do not take part in the model: written as 0.
    const int nTerms = std::max(psRF->nTerms, 0);
    for (int i = 0; i < nTerms; ++i) {
        values.aadfCoeff[kSampNum][i] = psRF->padfPixelNum[i];
        values.aadfCoeff[kSampDen][i] = psRF->padfPixelDen[i];
        values.aadfCoeff[kLineNum][i] = psRF->padfLineNum[i];
        values.aadfCoeff[kLineDen][i] = psRF->padfLineDen[i];
    }
    if (psRF->nAdjust) FoldAdjustment(psRF, values);
    for (int k = 0; k < kScalarCount; ++k) {
        CheckFinite(values.adfScalar[k], kTxtScalarKeys[k]);
        if (k >= kLineScale && values.adfScalar[k] == 0.0) {
            RPC_REFUSE(std::string(kTxtScalarKeys[k]) + " is 0");
        }
    }
    for (int i = 0; i < nTerms; ++i) {
        for (int nList = 0; nList < kListCount; ++nList) {
            CheckFinite(values.aadfCoeff[nList][i], kTxtListPrefixes[nList]);
        }
    }
    values.osSensor = BoundedText(psRF->pszSensor);
    return values;
}

// Shortest "%g" form that reads back to the same double, with its sign.
std::string ExactNumber(double dfValue) {
    for (int nDigits = 15; nDigits <= 17; ++nDigits) {
        std::string osText = nova::FormatString("%+.*g", nDigits, dfValue);
        if (std::strtod(osText.c_str(), nullptr) == dfValue) return osText;
    }
    return nova::FormatString("%+.17g", dfValue);
}

std::string Coefficient(double dfValue) {
    return nova::FormatString("%+.16E", dfValue);
}

// The spelling of a field's key in one form: the error estimates have one
// name per form, other keys are written as read.
std::string KeyInForm(const LumoRPCField& sField, bool bTxt) {
    for (const FieldSpelling& sSpelling : kFieldSpellings) {
        if (EqualNoCase(sField.osKey, sSpelling.pszTxt) ||
            EqualNoCase(sField.osKey, sSpelling.pszRpb)) {
            return bTxt ? sSpelling.pszTxt : sSpelling.pszRpb;
        }
    }
    return sField.osKey;
}

bool IsErrorEstimate(const LumoRPCField& sField) {
    return KeyInForm(sField, true) != KeyInForm(sField, false);
}

// A key that names a model value of either form, which a field must not take.
bool IsModelKey(const std::string& osKey) {
    for (int k = 0; k < kScalarCount; ++k) {
        if (EqualNoCase(osKey, kTxtScalarKeys[k]) || EqualNoCase(osKey, kRpbScalarKeys[k])) {
            return true;
        }
    }
    for (int nList = 0; nList < kListCount; ++nList) {
        if (StartsWithNoCase(osKey, kTxtListPrefixes[nList]) ||
            EqualNoCase(osKey, kRpbListKeys[nList])) {
            return true;
        }
    }
    return false;
}

// A field the form can write so that reading it back gives it again.
void CheckField(const LumoRPCField& sField, bool bTxt) {
    const char* pszKeyStops = bTxt ? ":\r\n" : "=;()\"\r\n\t ";
    const char* pszValueStops = bTxt ? "\r\n" : sField.bQuoted ? "\"\r\n" : ";\"\r\n";
    const bool bOpenList = !bTxt && !sField.bQuoted && !StatementComplete(sField.osValue + " ");
    if (sField.osKey.empty() || Trim(sField.osKey) != sField.osKey || bOpenList ||
        sField.osKey.find_first_of(pszKeyStops) != std::string::npos ||
        sField.osValue.find_first_of(pszValueStops) != std::string::npos ||
        IsModelKey(sField.osKey)) {
        RPC_REFUSE("the field " + Shown(sField.osKey) + " = " + Shown(sField.osValue) +
                   " cannot be written in the " + (bTxt ? "\"KEY: value\"" : "\"name = value;\"") +
                   " form");
    }
}

std::string WriteTxt(const RpcValues& values, const std::vector<LumoRPCField>& aoFields) {
    std::string osText;
    for (const LumoRPCField& sField : aoFields) {
        CheckField(sField, true);
        osText += KeyInForm(sField, true) + ": " + sField.osValue +
                  (IsErrorEstimate(sField) ? " meters" : "") + "\n";
    }
    for (int k = 0; k < kScalarCount; ++k) {
        osText += std::string(kTxtScalarKeys[k]) + ": " + ExactNumber(values.adfScalar[k]) + " " +
                  kUnits[k] + "\n";
    }
    for (int nList = 0; nList < kListCount; ++nList) {
        for (int i = 0; i < RF_MAX_TERMS; ++i) {
            osText += kTxtListPrefixes[nList] + std::to_string(i + 1) + ": " +
                      Coefficient(values.aadfCoeff[nList][i]) + "\n";
        }
    }
    return osText;
}

std::string Statement(const LumoRPCField& sField, const char* pszIndent) {
    CheckField(sField, false);
    const std::string osValue = sField.bQuoted ? "\"" + sField.osValue + "\"" : sField.osValue;
    return pszIndent + KeyInForm(sField, false) + " = " + osValue + ";\n";
}

bool HasField(const std::vector<LumoRPCField>& aoFields, const char* pszKey) {
    return std::any_of(aoFields.begin(), aoFields.end(),
                       [pszKey](const LumoRPCField& f) { return EqualNoCase(f.osKey, pszKey); });
}

// Names (quoted fields) head the text; numbers such as the error estimates
// go inside the image group.
std::string WriteRpb(const RpcValues& values, const std::vector<LumoRPCField>& aoFields) {
    std::string osText;
    // A sensor name with a quote or a line end cannot be written in the form.
    bool bPlainSensor = !values.osSensor.empty() && !HasField(aoFields, "satId");
    for (char ch : values.osSensor) bPlainSensor = bPlainSensor && ch != '"' && ch >= ' ';
    if (bPlainSensor) osText += "satId = \"" + values.osSensor + "\";\n";
    for (const LumoRPCField& sField : aoFields) {
        if (sField.bQuoted) osText += Statement(sField, "");
    }
    if (!HasField(aoFields, "SpecId")) osText += "SpecId = \"RPC00B\";\n";
    osText += "BEGIN_GROUP = IMAGE\n";
    for (const LumoRPCField& sField : aoFields) {
        if (!sField.bQuoted) osText += Statement(sField, "\t");
    }
    for (int k = 0; k < kScalarCount; ++k) {
        osText += std::string("\t") + kRpbScalarKeys[k] + " = " + ExactNumber(values.adfScalar[k]) +
                  ";\n";
    }
    for (int nList = 0; nList < kListCount; ++nList) {
        osText += std::string("\t") + kRpbListKeys[nList] + " = (";
        for (int i = 0; i < RF_MAX_TERMS; ++i) {
            osText += "\n\t\t\t" + Coefficient(values.aadfCoeff[nList][i]) +
                      (i + 1 < RF_MAX_TERMS ? "," : ");\n");
        }
    }
    osText += "END_GROUP = IMAGE\nEND;\n";
    return osText;
}

}  // namespace

int LumoDetectRPCTextForm(const char* pszText, std::size_t nLength) {
    if (pszText == nullptr) return LUMO_RPC_TEXT_AUTO;
    const std::string osText(pszText, nLength);
    if (LooksFixed(FixedRecord(osText))) return LUMO_RPC_TEXT_FIXED;
    for (const std::string& osRaw : SplitLines(osText)) {
        const std::string osLine = Trim(osRaw);
        if (osLine.empty()) continue;
        const std::size_t nColon = osLine.find(':');
        const std::size_t nEquals = osLine.find('=');
        if (nColon != std::string::npos && nColon < nEquals) return LUMO_RPC_TEXT_TXT;
        if (nEquals != std::string::npos) return LUMO_RPC_TEXT_RPB;
        return LUMO_RPC_TEXT_AUTO;
    }
    return LUMO_RPC_TEXT_AUTO;
}

RFInfo_t* LumoRPCTextToRFInfo(const char* pszText, std::size_t nLength, int nForm,
                              const char* pszSource, std::vector<LumoRPCField>* paoFields) {
    const std::string osSource = pszSource != nullptr ? pszSource : "RPC text";
    if (pszText == nullptr) RPC_FAIL(osSource + ": no text");
    if (nForm == LUMO_RPC_TEXT_AUTO) nForm = LumoDetectRPCTextForm(pszText, nLength);
    const std::string osText(pszText, nLength);
    RpcValues values;
    switch (nForm) {
        case LUMO_RPC_TEXT_TXT:
            values = ReadTxt(osText, osSource);
            break;
        case LUMO_RPC_TEXT_RPB:
            values = ReadRpb(osText, osSource);
            break;
        case LUMO_RPC_TEXT_FIXED:
            values = ReadFixed(osText, osSource);
            break;
        default:
            RPC_FAIL(osSource +
                     ": not RPC text (neither \"KEY: value\" lines, \"name = value;\" "
                     "statements nor a fixed-width record)");
    }
    RFInfo_t* psRF = CheckedRecord(ValuesToRecord(values), osSource);
    if (paoFields != nullptr) *paoFields = std::move(values.aoFields);
    return psRF;
}

std::string LumoRFInfoToRPCText(const RFInfo_t* psRF, int nForm,
                                const std::vector<LumoRPCField>& aoFields) {
    const RpcValues values = RecordToValues(psRF);
    switch (nForm) {
        case LUMO_RPC_TEXT_TXT:
            return WriteTxt(values, aoFields);
        case LUMO_RPC_TEXT_RPB:
            return WriteRpb(values, aoFields);
        default:
            RPC_REFUSE("unknown text form " + std::to_string(nForm) +
                       " (the fixed-width form is read only)");
    }
}
