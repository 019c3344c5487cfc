// Internal bridge between projection descriptions and PROJ: the coordinate
// reference system that a ProjInfo_t stands for, as a definition PROJ
// accepts, and the per-thread PROJ context. Also the parsed form of a
// georeferencing text and the earth-model tables shared by the projection
// sources.
#pragma once

#include <cstddef>
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
// nMaxLen for a terminated C string of unknown length.
constexpr std::size_t kUnboundedText = static_cast<std::size_t>(-1);

enum class GeosysError {
    kNone,
    kEmpty,       // null or blank text
    kTooLong,     // longer than kMaxGeosysInput
    kUnit,        // unknown keyword, bad zone, band or extra tokens
    kEarthModel,  // malformed or unknown Dnnn / Ennn code
};

struct ParsedGeosys {
    int nKind = NOVA_PROJ_UNKNOWN;
    int nZone = 0;        // UTM: 1..60, negative in the southern hemisphere
    char cBand = '\0';    // UTM latitude band letter, '\0' when not given
    char cModel = '\0';   // 'D', 'E' or '\0' (no earth model in the text)
    int nModelCode = -1;  // number after the model letter
    char szNormalised[kMaxNormalisedGeosys + 1] = {};
};

// Parses at most nMaxLen characters of pszText (a terminator may come
// earlier). Quiet: reports nothing. On failure *psOut holds the unknown kind.
GeosysError ParseGeosys(const char* pszText, std::size_t nMaxLen, ParsedGeosys* psOut);

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

}  // namespace detail
}  // namespace nova
