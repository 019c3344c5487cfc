// Internal bridge between projection descriptions and PROJ: the coordinate
// reference system that a ProjInfo_t stands for, as a definition PROJ
// accepts, and the per-thread PROJ context. Also the parsed form of a
// georeferencing text and the earth-model tables shared by the projection
// sources.
#pragma once

#include <cstddef>
#include <memory>
#include <string>

#include <proj.h>

#include "projection.h"

namespace nova {
namespace detail {

// Definition of the horizontal CRS a description stands for, in a form
// proj_create() accepts ("EPSG:4326", "+proj=longlat ... +type=crs" or
// PROJJSON). Empty for descriptions without a ground CRS (PIXEL, METRE, an
// empty or unknown text) and for descriptions that cannot be expressed (bad
// projection parameters, an unusable earth model). Geographic CRSs keep the
// axis order of their definition (latitude first for EPSG codes); callers
// that want longitude first use proj_normalize_for_visualization.
// Safe to call from any thread; never throws.
std::string ProjInfoToProjDefinition(const ProjInfo_t& sInfo);

// Owners of PROJ objects and contexts.
struct PJDeleter {
    void operator()(PJ* pj) const noexcept { proj_destroy(pj); }
};
using PJPtr = std::unique_ptr<PJ, PJDeleter>;

struct ContextDeleter {
    void operator()(PJ_CONTEXT* poCtx) const noexcept { proj_context_destroy(poCtx); }
};
using ContextPtr = std::unique_ptr<PJ_CONTEXT, ContextDeleter>;

// The calling thread's PROJ context (created on first use, released when the
// thread ends). PROJ objects must only be used with the context that made them.
PJ_CONTEXT* ThreadProjContext();

// ---------------------------------------------------------------------------
// Georeferencing texts
// ---------------------------------------------------------------------------

// Longest normalised text, terminator excluded (fits a 20-byte buffer).
constexpr std::size_t kMaxNormalisedGeosys = 19;
// Input texts longer than this are rejected without being read further.
constexpr std::size_t kMaxGeosysInput = 256;
// The same for PROJ strings, WKT and PROJJSON, which run long.
constexpr std::size_t kMaxDefinitionInput = 65536;
// nMaxLen for a terminated C string of unknown length.
constexpr std::size_t kUnboundedText = static_cast<std::size_t>(-1);

enum class GeosysError {
    kNone,
    kEmpty,       // null or blank text
    kTooLong,     // longer than kMaxGeosysInput
    kUnit,        // unknown keyword, bad zone, band or extra tokens
    kEarthModel,  // malformed or unknown Dnnn / Ennn code
    kDefinition,  // an EPSG code, PROJ string or WKT that does not give a usable system
};

struct ParsedGeosys {
    int nKind = NOVA_PROJ_UNKNOWN;
    int nEpsg = 0;        // the code of an "EPSG:n" text, else 0
    int nZone = 0;        // UTM: 1..60, negative in the southern hemisphere
    char cBand = '\0';    // UTM latitude band letter, '\0' when not given
    char cModel = '\0';   // 'D', 'E' or '\0' (no earth model in the text)
    int nModelCode = -1;  // number after the model letter
    char szNormalised[kMaxNormalisedGeosys + 1] = {};
    // Projection parameters that a translated PROJ string or WKT brings
    // (GCTP convention); the text alone does not carry them.
    bool bHasParms = false;
    double adfParms[NOVA_PROJ_PARMS] = {};
};

// Parses at most nMaxLen characters of pszText (a terminator may come
// earlier). Quiet: reports nothing. On failure *psOut holds the unknown kind.
GeosysError ParseGeosys(const char* pszText, std::size_t nMaxLen, ParsedGeosys* psOut);
// Why a text is refused, in a sentence; empty when it is accepted.
std::string GeosysProblemText(const char* pszText, std::size_t nMaxLen);

// ---------------------------------------------------------------------------
// Earth models
// ---------------------------------------------------------------------------

constexpr int kSpheroidCount = 20;

struct SpheroidEntry {
    const char* pszName;
    double dfSemiMajor;
    double dfSemiMinor;
};

struct DatumEntry {
    const char* pszName;
    int nSpheroid;        // GCTP spheroid code of its ellipsoid
    int nEpsgGeographic;  // EPSG code of its geographic 2-D CRS
};

// GCTP spheroid by code 0..19, or null.
const SpheroidEntry* FindSpheroid(int nCode);
// Datum table entry by Dnnn number, or null; and the table size.
const DatumEntry* FindDatum(int nCode);
int DatumCount();

// The earth model a description resolves to.
struct EarthModel {
    int nDatum = -1;     // datum table number, -1 for an ellipsoid alone
    int nSpheroid = -1;  // GCTP code, -1 for explicit axes not in the table
    double dfSemiMajor = 0.0;
    double dfSemiMinor = 0.0;
    int nEpsgGeographic = 0;  // 0 when the model has no EPSG datum
};

// Resolves the earth model of a description: with nEarthModelKind 3 from
// nSpheroid and adfProjParms[0..1] (an ellipsoid without datum), otherwise
// from the text's Dnnn / Ennn code, WGS 84 when it has none. False when the
// model is unknown or its axes are unusable.
bool ResolveEarthModel(const ProjInfo_t& sInfo, const ParsedGeosys& sParsed, EarthModel* psOut);
// GCTP code of the listed spheroid nearest to these axes (both within 1 mm),
// or -1.
int NearestSpheroid(double dfSemiMajor, double dfSemiMinor);

// ---------------------------------------------------------------------------
// Coordinate reference systems by EPSG code, and PROJ strings, WKT and
// PROJJSON definitions (projection_foreign.cpp)
// ---------------------------------------------------------------------------

// What a description needs to know of a system that PROJ defines.
struct ForeignSystem {
    int nKind = NOVA_PROJ_UNKNOWN;  // NOVA_PROJ_UNKNOWN when the system is refused
    int nZone = 0;                  // UTM zone, negative in the southern hemisphere
    bool bConformal = false;
    bool bDatumless = false;  // an ellipsoid without a datum (PROJ string with +ellps)
    EarthModel sModel;        // nDatum -1 when the datum is not in our table
    double adfParms[NOVA_PROJ_PARMS] = {};  // GCTP parameters of TM, LCC, PS, MER
    std::string osName;                     // the system's name
    std::string osProblem;                  // why it is refused
};

// True when a text is a PROJ string, WKT or PROJJSON rather than our grammar.
bool IsProjDefinition(const char* pszText, std::size_t nLen);
// The system of an EPSG code (looked up once per thread).
const ForeignSystem& LookupEpsg(int nCode);
// A PROJ string, WKT or PROJJSON definition as one of our texts: "EPSG:n"
// when PROJ identifies it with exactly one EPSG system, else a text of our
// grammar with its parameters. An empty text and osProblem on refusal.
struct TranslatedDefinition {
    std::string osText;
    bool bHasParms = false;
    double adfParms[NOVA_PROJ_PARMS] = {};
    std::string osProblem;
};
const TranslatedDefinition& TranslateDefinition(const std::string& osDefinition);

}  // namespace detail
}  // namespace nova
