// Georeferencing texts and projection descriptions: parsing and normalising
// texts, filling ProjInfo_t records, parameter texts, packed DMS angles and
// UTM zones. Reprojection itself is in projection_proj.cpp.

#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "proj_definition.h"
#include "projection.h"
#include "runtime.h"

namespace nova {
namespace detail {
namespace {

struct KeywordEntry {
    const char* pszKeyword;  // as written in a normalised text
    const char* pszAlias;    // accepted spelling, or null
    int nKind;
};

constexpr KeywordEntry kKeywords[] = {
    {"PIXEL", nullptr, NOVA_PROJ_PIXEL},
    {"METRE", "METER", NOVA_PROJ_METRE},
    {"LONG/LAT", nullptr, NOVA_PROJ_GEOGRAPHIC},
    {"LONG", nullptr, NOVA_PROJ_GEOGRAPHIC},
    {"LON", nullptr, NOVA_PROJ_GEOGRAPHIC},
    {"UTM", nullptr, NOVA_PROJ_UTM},
    {"TM", nullptr, NOVA_PROJ_TM},
    {"LCC", nullptr, NOVA_PROJ_LCC},
    {"PS", nullptr, NOVA_PROJ_PS},
    {"MER", nullptr, NOVA_PROJ_MER},
};

// UTM latitude bands from 80 S northwards, 8 degrees each (X spans 12).
constexpr char kBands[] = "CDEFGHJKLMNPQRSTUVWX";

// Splits at white space into upper-case tokens; false when there are more
// than nMaxTokens or a token is longer than 15 characters.
bool Tokenise(const char* pszText, std::size_t nLen, std::vector<std::string>* paoTokens,
              std::size_t nMaxTokens) {
    std::string osToken;
    for (std::size_t i = 0; i <= nLen; ++i) {
        const unsigned char c = i < nLen ? static_cast<unsigned char>(pszText[i]) : ' ';
        if (std::isspace(c)) {
            if (!osToken.empty()) {
                if (paoTokens->size() == nMaxTokens) return false;
                paoTokens->push_back(osToken);
                osToken.clear();
            }
            continue;
        }
        if (osToken.size() == 15) return false;
        osToken.push_back(static_cast<char>(std::toupper(c)));
    }
    return true;
}

bool AllDigits(const std::string& osText) {
    if (osText.empty()) return false;
    for (char c : osText) {
        if (!std::isdigit(static_cast<unsigned char>(c))) return false;
    }
    return true;
}

// "D0", "D000", "E12": a model letter and one to three digits.
bool IsEarthModelToken(const std::string& osToken) {
    return osToken.size() >= 2 && osToken.size() <= 4 && (osToken[0] == 'D' || osToken[0] == 'E') &&
           AllDigits(osToken.substr(1));
}

int FindKeyword(const std::string& osToken, const char** ppszKeyword) {
    for (const KeywordEntry& sEntry : kKeywords) {
        if (osToken == sEntry.pszKeyword ||
            (sEntry.pszAlias != nullptr && osToken == sEntry.pszAlias)) {
            *ppszKeyword = sEntry.pszKeyword;
            return sEntry.nKind;
        }
    }
    return NOVA_PROJ_UNKNOWN;
}

// "EPSG:n", n of one to seven digits: the code, else 0.
int EpsgCode(const std::string& osToken) {
    if (osToken.compare(0, 5, "EPSG:") != 0) return 0;
    const std::string osDigits = osToken.substr(5);
    if (!AllDigits(osDigits) || osDigits.size() > 7) return 0;
    return std::atoi(osDigits.c_str());
}

// A system PROJ's database defines: its code is the normalised text.
GeosysError ParseEpsg(int nCode, ParsedGeosys* psOut) {
    const ForeignSystem& sSystem = LookupEpsg(nCode);
    if (sSystem.nKind == NOVA_PROJ_UNKNOWN) return GeosysError::kDefinition;
    ParsedGeosys sParsed;
    sParsed.nKind = sSystem.nKind;
    sParsed.nZone = sSystem.nZone;
    sParsed.nEpsg = nCode;
    sParsed.bHasParms = RequiresProjInfo(sSystem.nKind) != 0;
    std::copy_n(sSystem.adfParms, NOVA_PROJ_PARMS, sParsed.adfParms);
    std::snprintf(sParsed.szNormalised, sizeof(sParsed.szNormalised), "EPSG:%d", nCode);
    *psOut = sParsed;
    return GeosysError::kNone;
}

// A PROJ string, WKT or PROJJSON: parsed as the text it translates into,
// with the parameters the translation brings.
GeosysError ParseDefinition(const char* pszText, std::size_t nLen, ParsedGeosys* psOut) {
    if (nLen > kMaxDefinitionInput) return GeosysError::kTooLong;
    const TranslatedDefinition& sTranslated = TranslateDefinition(std::string(pszText, nLen));
    if (sTranslated.osText.empty()) return GeosysError::kDefinition;
    ParsedGeosys sParsed;
    const GeosysError eError =
        ParseGeosys(sTranslated.osText.c_str(), sTranslated.osText.size(), &sParsed);
    if (eError != GeosysError::kNone) return eError;
    if (sTranslated.bHasParms) {
        sParsed.bHasParms = true;
        std::copy_n(sTranslated.adfParms, NOVA_PROJ_PARMS, sParsed.adfParms);
    }
    *psOut = sParsed;
    return GeosysError::kNone;
}

}  // namespace

GeosysError ParseGeosys(const char* pszText, std::size_t nMaxLen, ParsedGeosys* psOut) {
    *psOut = ParsedGeosys();
    if (pszText == nullptr) return GeosysError::kEmpty;
    const std::size_t nLen = strnlen(pszText, std::min(nMaxLen, kMaxDefinitionInput + 1));
    if (IsProjDefinition(pszText, nLen)) return ParseDefinition(pszText, nLen, psOut);
    if (nLen > kMaxGeosysInput) return GeosysError::kTooLong;

    std::vector<std::string> aoTokens;
    if (!Tokenise(pszText, nLen, &aoTokens, 4)) return GeosysError::kUnit;
    if (aoTokens.empty()) return GeosysError::kEmpty;
    if (const int nCode = EpsgCode(aoTokens[0])) {
        return aoTokens.size() == 1 ? ParseEpsg(nCode, psOut) : GeosysError::kUnit;
    }

    const char* pszKeyword = nullptr;
    const int nKind = FindKeyword(aoTokens[0], &pszKeyword);
    if (nKind == NOVA_PROJ_UNKNOWN) return GeosysError::kUnit;

    ParsedGeosys sParsed;
    sParsed.nKind = nKind;
    std::size_t iToken = 1;
    if (nKind == NOVA_PROJ_UTM) {
        if (iToken >= aoTokens.size() || !AllDigits(aoTokens[iToken]) ||
            aoTokens[iToken].size() > 3) {
            return GeosysError::kUnit;
        }
        const int nZone = std::atoi(aoTokens[iToken].c_str());
        if (nZone < 1 || nZone > 60) return GeosysError::kUnit;
        ++iToken;
        sParsed.nZone = nZone;
        if (iToken < aoTokens.size() && aoTokens[iToken].size() == 1) {
            const char* pszBand = std::strchr(kBands, aoTokens[iToken][0]);
            if (pszBand == nullptr || *pszBand == '\0') return GeosysError::kUnit;
            sParsed.cBand = *pszBand;
            if (sParsed.cBand < 'N') sParsed.nZone = -nZone;
            ++iToken;
        }
    }
    if (iToken < aoTokens.size() && nKind != NOVA_PROJ_PIXEL && nKind != NOVA_PROJ_METRE) {
        const std::string& osModel = aoTokens[iToken];
        if (!IsEarthModelToken(osModel)) {
            return osModel[0] == 'D' || osModel[0] == 'E' ? GeosysError::kEarthModel
                                                          : GeosysError::kUnit;
        }
        sParsed.cModel = osModel[0];
        sParsed.nModelCode = std::atoi(osModel.c_str() + 1);
        const bool bKnown = sParsed.cModel == 'D' ? FindDatum(sParsed.nModelCode) != nullptr
                                                  : FindSpheroid(sParsed.nModelCode) != nullptr;
        if (!bKnown) return GeosysError::kEarthModel;
        ++iToken;
    }
    if (iToken != aoTokens.size()) return GeosysError::kUnit;

    std::string osNormal = pszKeyword;
    if (nKind == NOVA_PROJ_UTM) {
        osNormal += " " + std::to_string(std::abs(sParsed.nZone));
        if (sParsed.cBand != '\0') osNormal += std::string(" ") + sParsed.cBand;
    }
    if (sParsed.cModel != '\0') {
        char szModel[8];
        std::snprintf(szModel, sizeof(szModel), " %c%03d", sParsed.cModel, sParsed.nModelCode);
        osNormal += szModel;
    }
    // Longest is "LONG/LAT D000" / "UTM 60 X D011": well inside the buffer.
    std::snprintf(sParsed.szNormalised, sizeof(sParsed.szNormalised), "%s", osNormal.c_str());
    *psOut = sParsed;
    return GeosysError::kNone;
}

std::string GeosysProblemText(const char* pszText, std::size_t nMaxLen) {
    ParsedGeosys sParsed;
    switch (ParseGeosys(pszText, nMaxLen, &sParsed)) {
        case GeosysError::kNone:
            return std::string();
        case GeosysError::kEmpty:
            return "the text is empty";
        case GeosysError::kTooLong:
            return "the text is too long to be a georeferencing text";
        case GeosysError::kEarthModel:
            return "its earth model is unknown (datums D000 to D011, ellipsoids E000 to E019)";
        case GeosysError::kUnit:
            return "it is not a georeferencing text: expected PIXEL, METRE, LONG/LAT, "
                   "UTM <zone> [<band>], TM, LCC, PS or MER with an optional earth model "
                   "(D000, E012), an EPSG code (EPSG:32631), a PROJ string or WKT";
        case GeosysError::kDefinition:
            break;
    }
    const std::size_t nLen = strnlen(pszText, std::min(nMaxLen, kMaxDefinitionInput));
    if (IsProjDefinition(pszText, nLen)) {
        return TranslateDefinition(std::string(pszText, nLen)).osProblem;
    }
    std::vector<std::string> aoTokens;
    Tokenise(pszText, nLen, &aoTokens, 1);
    const ForeignSystem& sSystem = LookupEpsg(aoTokens.empty() ? 0 : EpsgCode(aoTokens[0]));
    return sSystem.osName.empty() ? sSystem.osProblem
                                  : "\"" + sSystem.osName + "\": " + sSystem.osProblem;
}

}  // namespace detail
}  // namespace nova

using nova::detail::GeosysError;
using nova::detail::ParsedGeosys;

std::string ExplainGeosys(const char* pszGeosys) {
    return nova::detail::GeosysProblemText(pszGeosys, nova::detail::kUnboundedText);
}

namespace {

// The offending text for a warning, cut short when very long.
std::string WarningValue(const char* pszText) {
    if (pszText == nullptr) return "(null)";
    const std::size_t nLen = strnlen(pszText, 65);
    std::string osValue(pszText, std::min<std::size_t>(nLen, 64));
    if (nLen > 64) osValue += "...";
    return osValue;
}

void WarnBadGeosys(GeosysError eError, const char* pszText, bool bWarnUnit) {
    if (eError == GeosysError::kEarthModel) {
        IMPErrChar(nova::kMsgUnsupportedUnit, 0, "Earth model", WarningValue(pszText).c_str());
    } else if (bWarnUnit) {
        IMPErrChar(nova::kMsgUnsupportedUnit, 0, "GCP Unit", WarningValue(pszText).c_str());
    }
}

void ResetRecord(ProjInfo_t* psInfo) {
    std::memset(psInfo, 0, sizeof(*psInfo));
    psInfo->dfXScale = 1.0;
    psInfo->dfYScale = 1.0;
    psInfo->nSpheroid = -1;
    psInfo->nEarthModelKind = NOVA_EARTH_DEFAULT;
    psInfo->nProjKind = NOVA_PROJ_UNKNOWN;
    psInfo->nDatum = -1;
}

}  // namespace

void InitProjInfo(ProjInfo_t* psInfo, int nMode) {
    if (psInfo == nullptr) return;
    ResetRecord(psInfo);
    if (nMode == 1) {
        std::snprintf(psInfo->szProj, sizeof(psInfo->szProj), "PIXEL");
        psInfo->nProjKind = NOVA_PROJ_PIXEL;
    }
}

int Geosys2ProjInfo(ProjInfo_t* psInfo, const char* pszGeosys, double dfXOffset, double dfYOffset,
                    double dfXScale, double dfYScale) {
    if (psInfo == nullptr) return -1;
    ParsedGeosys sParsed;
    const GeosysError eError =
        nova::detail::ParseGeosys(pszGeosys, nova::detail::kUnboundedText, &sParsed);
    if (eError != GeosysError::kNone) {
        WarnBadGeosys(eError, pszGeosys, true);
        return -1;
    }
    if (!std::isfinite(dfXOffset) || !std::isfinite(dfYOffset) || !std::isfinite(dfXScale) ||
        !std::isfinite(dfYScale)) {
        return -2;
    }
    nova::detail::EarthModel sModel;
    ProjInfo_t sNew;
    ResetRecord(&sNew);
    if (!nova::detail::ResolveEarthModel(sNew, sParsed, &sModel)) return -1;

    std::snprintf(sNew.szProj, sizeof(sNew.szProj), "%s", sParsed.szNormalised);
    sNew.dfXOffset = dfXOffset;
    sNew.dfYOffset = dfYOffset;
    sNew.dfXScale = dfXScale;
    sNew.dfYScale = dfYScale;
    sNew.nProjKind = sParsed.nKind;
    sNew.nZone = sParsed.nZone;
    const bool bGround = sParsed.nKind != NOVA_PROJ_PIXEL && sParsed.nKind != NOVA_PROJ_METRE;
    if (bGround) {
        sNew.nSpheroid = sModel.nSpheroid;
        sNew.nDatum = sModel.nDatum;
        // A system by EPSG code names our datum or spheroid where one matches.
        const char cModel = sParsed.nEpsg == 0      ? sParsed.cModel
                            : sModel.nDatum >= 0    ? 'D'
                            : sModel.nSpheroid >= 0 ? 'E'
                                                    : '\0';
        sNew.nEarthModelKind = cModel == 'D'   ? NOVA_EARTH_DATUM
                               : cModel == 'E' ? NOVA_EARTH_ELLIPSOID
                                               : NOVA_EARTH_DEFAULT;
    }
    if (sParsed.bHasParms) std::copy_n(sParsed.adfParms, NOVA_PROJ_PARMS, sNew.adfProjParms);
    *psInfo = sNew;
    return 0;
}

int ProjStringToProjInfo(const char* pszProj, ProjInfo_t* psInfo) {
    return Geosys2ProjInfo(psInfo, pszProj, 0.0, 0.0, 1.0, 1.0) == 0 ? 0 : -1;
}

int DecodeGeosys(const char* pszGeosys, char* pszOut) {
    ParsedGeosys sParsed;
    const GeosysError eError =
        nova::detail::ParseGeosys(pszGeosys, nova::detail::kUnboundedText, &sParsed);
    if (eError != GeosysError::kNone) WarnBadGeosys(eError, pszGeosys, false);
    // sParsed is a copy, so writing over the input (pszOut == pszGeosys) is safe.
    if (pszOut != nullptr)
        std::memcpy(pszOut, sParsed.szNormalised, std::strlen(sParsed.szNormalised) + 1);
    return sParsed.nKind;
}

int RequiresProjInfo(int nKind) {
    return nKind == NOVA_PROJ_TM || nKind == NOVA_PROJ_LCC || nKind == NOVA_PROJ_PS ||
                   nKind == NOVA_PROJ_MER
               ? 1
               : 0;
}

int IsConformal(const char* pszGeosys) {
    ParsedGeosys sParsed;
    nova::detail::ParseGeosys(pszGeosys, nova::detail::kUnboundedText, &sParsed);
    switch (sParsed.nKind) {
        case NOVA_PROJ_METRE:
        case NOVA_PROJ_UTM:
        case NOVA_PROJ_TM:
        case NOVA_PROJ_LCC:
        case NOVA_PROJ_PS:
        case NOVA_PROJ_MER:
            return 1;
        case NOVA_PROJ_OTHER:
            return nova::detail::LookupEpsg(sParsed.nEpsg).bConformal ? 1 : 0;
        default:
            return 0;
    }
}

// ---------------------------------------------------------------------------
// UTM zones
// ---------------------------------------------------------------------------

int UTMZone(double dfLon, double dfLat, int* pnZone, char* pcRow) {
    if (pnZone) *pnZone = 0;
    if (pcRow) *pcRow = 'Z';
    if (!std::isfinite(dfLon) || !std::isfinite(dfLat) || dfLat < -90.0 || dfLat > 90.0) {
        return -1;
    }
    double dfWrapped = std::fmod(dfLon + 180.0, 360.0);
    if (dfWrapped < 0.0) dfWrapped += 360.0;
    if (dfWrapped == 0.0 && dfLon > 0.0) dfWrapped = 360.0;  // 180 E closes zone 60
    int nZone = static_cast<int>(dfWrapped / 6.0) + 1;
    if (nZone > 60) nZone = 60;
    const double dfLonW = dfWrapped - 180.0;
    // The grid's exceptions: south-west Norway and Svalbard.
    if (dfLat >= 56.0 && dfLat < 64.0 && dfLonW >= 3.0 && dfLonW < 12.0) nZone = 32;
    if (dfLat >= 72.0 && dfLat <= 84.0) {
        if (dfLonW >= 0.0 && dfLonW < 9.0)
            nZone = 31;
        else if (dfLonW >= 9.0 && dfLonW < 21.0)
            nZone = 33;
        else if (dfLonW >= 21.0 && dfLonW < 33.0)
            nZone = 35;
        else if (dfLonW >= 33.0 && dfLonW < 42.0)
            nZone = 37;
    }
    if (pnZone) *pnZone = nZone;
    if (pcRow && dfLat >= -80.0 && dfLat <= 84.0) {
        const int nBand = std::min(19, static_cast<int>((dfLat + 80.0) / 8.0));
        *pcRow = "CDEFGHJKLMNPQRSTUVWX"[nBand];
    }
    return 0;
}

// ---------------------------------------------------------------------------
// Packed DMS
// ---------------------------------------------------------------------------

int PackedDMSToDegrees(double dfPacked, double* pdfDegrees) {
    if (!std::isfinite(dfPacked) || pdfDegrees == nullptr) return -1;
    const double dfAbs = std::fabs(dfPacked);
    const double dfDeg = std::floor(dfAbs / 1e6);
    const double dfMin = std::floor((dfAbs - dfDeg * 1e6) / 1e3);
    const double dfSec = dfAbs - dfDeg * 1e6 - dfMin * 1e3;
    if (dfMin >= 60.0 || dfSec >= 60.0) return -1;
    const double dfValue = dfDeg + dfMin / 60.0 + dfSec / 3600.0;
    *pdfDegrees = dfPacked < 0.0 ? -dfValue : dfValue;
    return 0;
}

double DegreesToPackedDMS(double dfDegrees) {
    if (!std::isfinite(dfDegrees)) return dfDegrees;
    const double dfAbs = std::fabs(dfDegrees);
    double dfDeg = std::floor(dfAbs);
    double dfMin = std::floor((dfAbs - dfDeg) * 60.0);
    double dfSec = std::round(((dfAbs - dfDeg) * 60.0 - dfMin) * 60.0 * 1e7) / 1e7;
    if (dfSec >= 60.0) {
        dfSec -= 60.0;
        dfMin += 1.0;
    }
    if (dfMin >= 60.0) {
        dfMin -= 60.0;
        dfDeg += 1.0;
    }
    const double dfPacked = dfDeg * 1e6 + dfMin * 1e3 + dfSec;
    return dfDegrees < 0.0 ? -dfPacked : dfPacked;
}

// ---------------------------------------------------------------------------
// Parameter texts
//
//   GCTP <nSpheroid> <nEarthModelKind> [<i>:<value>]...
//   GCTP <nSpheroid> <nEarthModelKind> #<160 base64 characters>
//
// The first form lists the non-zero parameters with the shortest decimal that
// reads back to the same double (never more than 17 significant digits). When
// it would not fit in 255 characters, the second form carries the 15
// parameters as little-endian IEEE doubles, which always fits.
// ---------------------------------------------------------------------------

namespace {

constexpr std::size_t kMaxParmsText = 255;
constexpr char kBase64[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

std::string ShortestDecimal(double dfValue) {
    char szBuf[40];
    // Whole numbers of up to 17 digits read better without an exponent.
    if (std::fabs(dfValue) < 1e17 && dfValue == std::trunc(dfValue)) {
        std::snprintf(szBuf, sizeof(szBuf), "%.0f", dfValue);
        return szBuf;
    }
    for (int nDigits = 1; nDigits <= 17; ++nDigits) {
        std::snprintf(szBuf, sizeof(szBuf), "%.*g", nDigits, dfValue);
        if (std::strtod(szBuf, nullptr) == dfValue) break;
    }
    return szBuf;
}

bool IsPositiveZero(double dfValue) {
    return dfValue == 0.0 && !std::signbit(dfValue);
}

std::string EncodeParmsBase64(const double* padfParms) {
    unsigned char abyBytes[NOVA_PROJ_PARMS * 8];
    for (int i = 0; i < NOVA_PROJ_PARMS; ++i) {
        std::uint64_t nBits;
        std::memcpy(&nBits, &padfParms[i], 8);
        for (int j = 0; j < 8; ++j)
            abyBytes[i * 8 + j] = static_cast<unsigned char>(nBits >> (8 * j));
    }
    std::string osOut;
    for (std::size_t i = 0; i < sizeof(abyBytes); i += 3) {
        const unsigned nTriple = (abyBytes[i] << 16) | (abyBytes[i + 1] << 8) | abyBytes[i + 2];
        for (int j = 3; j >= 0; --j) osOut.push_back(kBase64[(nTriple >> (6 * j)) & 63]);
    }
    return osOut;
}

bool DecodeParmsBase64(const char* pszText, double* padfParms) {
    constexpr std::size_t kBytes = std::size_t{NOVA_PROJ_PARMS} * 8;
    if (std::strlen(pszText) != kBytes / 3 * 4) return false;
    unsigned char abyBytes[kBytes];
    for (std::size_t i = 0, o = 0; i < kBytes / 3 * 4; i += 4, o += 3) {
        unsigned nTriple = 0;
        for (int j = 0; j < 4; ++j) {
            const char* pszPos = std::strchr(kBase64, pszText[i + j]);
            if (pszPos == nullptr || *pszPos == '\0') return false;
            nTriple = (nTriple << 6) | static_cast<unsigned>(pszPos - kBase64);
        }
        abyBytes[o] = static_cast<unsigned char>(nTriple >> 16);
        abyBytes[o + 1] = static_cast<unsigned char>(nTriple >> 8);
        abyBytes[o + 2] = static_cast<unsigned char>(nTriple);
    }
    for (int i = 0; i < NOVA_PROJ_PARMS; ++i) {
        std::uint64_t nBits = 0;
        for (int j = 7; j >= 0; --j) nBits = (nBits << 8) | abyBytes[i * 8 + j];
        std::memcpy(&padfParms[i], &nBits, 8);
    }
    return true;
}

char* DuplicateText(const std::string& osText) {
    char* pszOut = static_cast<char*>(HMalloc(osText.size() + 1));
    std::memcpy(pszOut, osText.c_str(), osText.size() + 1);
    return pszOut;
}

// Reads a decimal integer token in [nMin, nMax] and advances *ppszPos.
bool ReadInt(const char** ppszPos, int nMin, int nMax, int* pnOut) {
    char* pszEnd = nullptr;
    const long nValue = std::strtol(*ppszPos, &pszEnd, 10);
    if (pszEnd == *ppszPos || nValue < nMin || nValue > nMax) return false;
    *ppszPos = pszEnd;
    *pnOut = static_cast<int>(nValue);
    return true;
}

bool SkipBlank(const char** ppszPos) {
    if (**ppszPos != ' ') return false;
    while (**ppszPos == ' ') ++*ppszPos;
    return true;
}

}  // namespace

char* ProjInfo2Parms(const ProjInfo_t* psInfo) {
    ProjInfo_t sEmpty;
    if (psInfo == nullptr) {
        InitProjInfo(&sEmpty, 0);
        psInfo = &sEmpty;
    }
    const int nSpheroid =
        psInfo->nSpheroid >= -1 && psInfo->nSpheroid < 20 ? psInfo->nSpheroid : -1;
    const int nKind =
        psInfo->nEarthModelKind >= 0 && psInfo->nEarthModelKind <= 3 ? psInfo->nEarthModelKind : 0;
    const std::string osHead = "GCTP " + std::to_string(nSpheroid) + " " + std::to_string(nKind);
    std::string osText = osHead;
    for (int i = 0; i < NOVA_PROJ_PARMS; ++i) {
        const double dfValue = psInfo->adfProjParms[i];
        if (IsPositiveZero(dfValue)) continue;
        if (!std::isfinite(dfValue)) {
            osText.assign(kMaxParmsText + 1, ' ');  // forces the exact binary form
            break;
        }
        osText += " " + std::to_string(i) + ":" + ShortestDecimal(dfValue);
    }
    if (osText.size() > kMaxParmsText)
        osText = osHead + " #" + EncodeParmsBase64(psInfo->adfProjParms);
    return DuplicateText(osText);
}

int ProjParms2Info(const char* pszParms, ProjInfo_t* psInfo) {
    if (pszParms == nullptr || psInfo == nullptr) return -1;
    if (strnlen(pszParms, kMaxParmsText + 1) > kMaxParmsText) return -1;
    if (std::strncmp(pszParms, "GCTP", 4) != 0) return -1;
    const char* pszPos = pszParms + 4;
    int nSpheroid = 0;
    int nKind = 0;
    if (!SkipBlank(&pszPos) || !ReadInt(&pszPos, -1, 19, &nSpheroid)) return -1;
    if (!SkipBlank(&pszPos) || !ReadInt(&pszPos, 0, 3, &nKind)) return -1;

    double adfParms[NOVA_PROJ_PARMS] = {};
    if (SkipBlank(&pszPos) && *pszPos == '#') {
        if (!DecodeParmsBase64(pszPos + 1, adfParms)) return -1;
        pszPos += std::strlen(pszPos);
    } else {
        bool abSeen[NOVA_PROJ_PARMS] = {};
        while (*pszPos != '\0') {
            int nIndex = 0;
            if (!ReadInt(&pszPos, 0, NOVA_PROJ_PARMS - 1, &nIndex) || *pszPos != ':') return -1;
            if (abSeen[nIndex]) return -1;
            abSeen[nIndex] = true;
            ++pszPos;
            if (*pszPos == ' ' || *pszPos == '\0') return -1;
            char* pszEnd = nullptr;
            adfParms[nIndex] = std::strtod(pszPos, &pszEnd);
            if (pszEnd == pszPos) return -1;
            pszPos = pszEnd;
            if (*pszPos != '\0' && !SkipBlank(&pszPos)) return -1;
        }
    }
    for (double dfValue : adfParms) {
        if (!std::isfinite(dfValue)) return -1;
    }
    std::memcpy(psInfo->adfProjParms, adfParms, sizeof(adfParms));
    if (nKind == NOVA_EARTH_SPHEROID_PARMS) {
        psInfo->nSpheroid = nSpheroid;
        psInfo->nEarthModelKind = NOVA_EARTH_SPHEROID_PARMS;
    }
    return 0;
}
