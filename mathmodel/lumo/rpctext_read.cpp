// Readers of the three RPC text forms: the "KEY: value" lines of *_RPC.TXT
// files, the "name = value;" statements of .RPB files and the fixed-width
// record of RPC-*.txt files. Each value is stored once with the line it came
// from, so a repeated or missing key is named in the message; fields that are
// not model values are kept in file order.
#include <algorithm>
#include <array>
#include <cctype>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "rpctext_internal.h"

namespace lumo {
namespace rpctext {

namespace {

bool IsBlank(char ch) {
    return ch == ' ' || ch == '\t' || ch == '\r' || ch == '\n';
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

constexpr std::array<std::size_t, kScalarCount> kFixedScalarWidths = {6, 5, 8, 9, 5, 6, 5, 8, 9, 5};
constexpr std::size_t kFixedCoeffWidth = 12;
constexpr std::size_t kFixedBody = 66 + kListCount * RF_MAX_TERMS * kFixedCoeffWidth;
constexpr std::size_t kFixedLead = 15;  // SUCCESS (1), ERR_BIAS (7), ERR_RAND (7)

// The number in the field at nStart, named after its key in messages.
double FixedField(const std::string& osRecord, std::size_t nStart, std::size_t nWidth,
                  const std::string& osKey, const std::string& osSource) {
    const Origin origin{
        osSource, 1, osKey,
        "characters " + std::to_string(nStart + 1) + "-" + std::to_string(nStart + nWidth)};
    return ParseNumber(Trim(osRecord.substr(nStart, nWidth)), origin);
}

}  // namespace

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

}  // namespace rpctext
}  // namespace lumo
