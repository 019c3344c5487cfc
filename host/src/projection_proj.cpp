// Projection descriptions on PROJ: the CRS definition of a description, the
// per-thread PROJ context and transformation cache, and point reprojection.

#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include <proj_experimental.h>

#include "proj_definition.h"
#include "projection.h"
#include "runtime.h"

namespace nova {
namespace detail {
namespace {

// How a cached pair of descriptions transforms its points.
enum class TransformMode { kFail, kIdentity, kProj };

// The fields a transformation depends on, zero-filled so that whole keys
// compare with memcmp (parameters as bit patterns: exact, NaN-safe).
struct DescriptionKey {
    char szProj[NOVA_GEOSYS_LEN];
    std::uint64_t anProjParmBits[NOVA_PROJ_PARMS];
    int nSpheroid;
    int nEarthModelKind;
};

struct PairKey {
    DescriptionKey sFrom;
    DescriptionKey sTo;
};

struct CachedTransform {
    PairKey sKey;
    TransformMode eMode = TransformMode::kFail;
    bool bFromGeographic = false;
    PJPtr poOperation;
};

constexpr std::size_t kCacheSize = 8;

// Everything PROJ-related that belongs to one thread. The cache goes before
// the context it was made with.
class ThreadProjState {
  public:
    ThreadProjState() : mpoContext(proj_context_create()) {
        proj_context_set_enable_network(mpoContext, 0);
        proj_log_func(mpoContext, nullptr, &ThreadProjState::Log);
    }
    ~ThreadProjState() {
        maoCache.clear();
        proj_context_destroy(mpoContext);
    }
    ThreadProjState(const ThreadProjState&) = delete;
    ThreadProjState& operator=(const ThreadProjState&) = delete;

    PJ_CONTEXT* Context() const { return mpoContext; }
    // Most recently used first.
    std::vector<std::unique_ptr<CachedTransform>>& Cache() { return maoCache; }

  private:
    // PROJ's own messages go to the debug log instead of standard error.
    static void Log(void*, int nLevel, const char* pszMessage) {
        if (nova::diag::Debugger::moDebugLevel == 0 || pszMessage == nullptr) return;
        nova::diag::Debugger::Debug(std::string("PROJ: ") + pszMessage, nLevel <= 1 ? 1 : 2,
                                    "nova_host", "host/src/projection_proj.cpp", __LINE__);
    }

    PJ_CONTEXT* mpoContext;
    std::vector<std::unique_ptr<CachedTransform>> maoCache;
};

ThreadProjState& ThreadState() {
    thread_local ThreadProjState oState;
    return oState;
}

std::string Format17(const char* pszFormat, double dfA, double dfB) {
    char szBuf[160];
    std::snprintf(szBuf, sizeof(szBuf), pszFormat, dfA, dfB);
    return szBuf;
}

// The geographic base of a projected description.
PJPtr CreateBaseCRS(PJ_CONTEXT* poCtx, const EarthModel& sModel) {
    if (sModel.nEpsgGeographic != 0) {
        return PJPtr(proj_create_from_database(poCtx, "EPSG",
                                               std::to_string(sModel.nEpsgGeographic).c_str(),
                                               PJ_CATEGORY_CRS, 0, nullptr));
    }
    return PJPtr(proj_create(poCtx, Format17("+proj=longlat +a=%.17g +b=%.17g +no_defs +type=crs",
                                             sModel.dfSemiMajor, sModel.dfSemiMinor)
                                        .c_str()));
}

bool Latitude(double dfPacked, double* pdfDegrees) {
    return PackedDMSToDegrees(dfPacked, pdfDegrees) == 0 && std::fabs(*pdfDegrees) <= 90.0;
}

bool Longitude(double dfPacked, double* pdfDegrees) {
    return PackedDMSToDegrees(dfPacked, pdfDegrees) == 0 && std::fabs(*pdfDegrees) <= 360.0;
}

// The map projection of a projected description, from its zone or its
// GCTP parameters (angles in packed DMS).
PJPtr CreateConversion(PJ_CONTEXT* poCtx, const ParsedGeosys& sParsed, const double* p) {
    const char* pszDeg = "Degree";
    const double dfDeg = 0.0174532925199433;
    const char* pszMetre = "Metre";
    double dfLon0 = 0.0;
    double dfLat0 = 0.0;
    double dfLat1 = 0.0;
    double dfLat2 = 0.0;
    switch (sParsed.nKind) {
        case NOVA_PROJ_UTM:
            return PJPtr(proj_create_conversion_utm(poCtx, std::abs(sParsed.nZone),
                                                    sParsed.nZone > 0 ? 1 : 0));
        case NOVA_PROJ_TM:
            if (!(p[2] > 0.0) || !Longitude(p[4], &dfLon0) || !Latitude(p[5], &dfLat0)) break;
            return PJPtr(proj_create_conversion_transverse_mercator(
                poCtx, dfLat0, dfLon0, p[2], p[6], p[7], pszDeg, dfDeg, pszMetre, 1.0));
        case NOVA_PROJ_LCC:
            if (!Latitude(p[2], &dfLat1) || !Latitude(p[3], &dfLat2) || !Longitude(p[4], &dfLon0) ||
                !Latitude(p[5], &dfLat0) || std::fabs(dfLat1 + dfLat2) < 1e-10) {
                break;
            }
            return PJPtr(proj_create_conversion_lambert_conic_conformal_2sp(
                poCtx, dfLat0, dfLon0, dfLat1, dfLat2, p[6], p[7], pszDeg, dfDeg, pszMetre, 1.0));
        case NOVA_PROJ_PS:
            // The sign of the latitude of true scale picks the pole.
            if (!Longitude(p[4], &dfLon0) || !Latitude(p[5], &dfLat1) || dfLat1 == 0.0) break;
            return PJPtr(proj_create_conversion_polar_stereographic_variant_b(
                poCtx, dfLat1, dfLon0, p[6], p[7], pszDeg, dfDeg, pszMetre, 1.0));
        case NOVA_PROJ_MER:
            if (!Longitude(p[4], &dfLon0) || !Latitude(p[5], &dfLat1) ||
                std::fabs(dfLat1) >= 90.0) {
                break;
            }
            return PJPtr(proj_create_conversion_mercator_variant_b(
                poCtx, dfLat1, dfLon0, p[6], p[7], pszDeg, dfDeg, pszMetre, 1.0));
        default:
            break;
    }
    return PJPtr();
}

std::string ProjectedDefinition(PJ_CONTEXT* poCtx, const ParsedGeosys& sParsed,
                                const EarthModel& sModel, const double* padfParms) {
    // WGS 84 UTM has EPSG codes of its own.
    if (sParsed.nKind == NOVA_PROJ_UTM && sModel.nEpsgGeographic == 4326) {
        const int nBase = sParsed.nZone > 0 ? 32600 : 32700;
        return "EPSG:" + std::to_string(nBase + std::abs(sParsed.nZone));
    }
    PJPtr poBase = CreateBaseCRS(poCtx, sModel);
    PJPtr poConversion = CreateConversion(poCtx, sParsed, padfParms);
    PJPtr poAxes(proj_create_cartesian_2D_cs(poCtx, PJ_CART2D_EASTING_NORTHING, "Metre", 1.0));
    if (!poBase || !poConversion || !poAxes) return std::string();
    PJPtr poCRS(proj_create_projected_crs(poCtx, sParsed.szNormalised, poBase.get(),
                                          poConversion.get(), poAxes.get()));
    if (!poCRS) return std::string();
    const char* pszJson = proj_as_projjson(poCtx, poCRS.get(), nullptr);
    return pszJson != nullptr ? std::string(pszJson) : std::string();
}

}  // namespace

PJ_CONTEXT* ThreadProjContext() {
    return ThreadState().Context();
}

std::string ProjInfoToProjDefinition(const ProjInfo_t& sInfo) {
    ParsedGeosys sParsed;
    if (ParseGeosys(sInfo.szProj, sizeof(sInfo.szProj), &sParsed) != GeosysError::kNone) {
        return std::string();
    }
    if (sParsed.nKind == NOVA_PROJ_PIXEL || sParsed.nKind == NOVA_PROJ_METRE) return std::string();
    if (sParsed.nEpsg != 0) return "EPSG:" + std::to_string(sParsed.nEpsg);
    EarthModel sModel;
    if (!ResolveEarthModel(sInfo, sParsed, &sModel)) return std::string();
    if (sParsed.nKind == NOVA_PROJ_GEOGRAPHIC) {
        if (sModel.nEpsgGeographic != 0) return "EPSG:" + std::to_string(sModel.nEpsgGeographic);
        return Format17("+proj=longlat +a=%.17g +b=%.17g +no_defs +type=crs", sModel.dfSemiMajor,
                        sModel.dfSemiMinor);
    }
    return ProjectedDefinition(ThreadProjContext(), sParsed, sModel, sInfo.adfProjParms);
}

namespace {

void FillKey(const ProjInfo_t& sInfo, DescriptionKey* psKey) {
    std::memset(psKey, 0, sizeof(*psKey));
    const std::size_t nLen = strnlen(sInfo.szProj, sizeof(sInfo.szProj) - 1);
    std::memcpy(psKey->szProj, sInfo.szProj, nLen);
    static_assert(sizeof(psKey->anProjParmBits) == sizeof(sInfo.adfProjParms), "bit copy");
    std::memcpy(psKey->anProjParmBits, sInfo.adfProjParms, sizeof(psKey->anProjParmBits));
    psKey->nSpheroid = sInfo.nSpheroid;
    psKey->nEarthModelKind = sInfo.nEarthModelKind;
}

// Builds the transformation of a pair not yet in the cache.
void BuildTransform(const ProjInfo_t& sFrom, const ProjInfo_t& sTo, CachedTransform* psOut) {
    ParsedGeosys sFromParsed;
    ParsedGeosys sToParsed;
    psOut->eMode = TransformMode::kFail;
    if (ParseGeosys(sFrom.szProj, sizeof(sFrom.szProj), &sFromParsed) != GeosysError::kNone ||
        ParseGeosys(sTo.szProj, sizeof(sTo.szProj), &sToParsed) != GeosysError::kNone) {
        return;
    }
    psOut->bFromGeographic = sFromParsed.nKind == NOVA_PROJ_GEOGRAPHIC;
    const auto IsPlane = [](int nKind) {
        return nKind == NOVA_PROJ_PIXEL || nKind == NOVA_PROJ_METRE;
    };
    if (IsPlane(sFromParsed.nKind) || IsPlane(sToParsed.nKind)) {
        // Image and local metric planes relate only to themselves.
        if (sFromParsed.nKind == sToParsed.nKind) psOut->eMode = TransformMode::kIdentity;
        return;
    }
    const std::string osFrom = ProjInfoToProjDefinition(sFrom);
    const std::string osTo = ProjInfoToProjDefinition(sTo);
    if (osFrom.empty() || osTo.empty()) return;
    if (std::memcmp(&psOut->sKey.sFrom, &psOut->sKey.sTo, sizeof(DescriptionKey)) == 0) {
        psOut->eMode = TransformMode::kIdentity;
        return;
    }
    PJ_CONTEXT* poCtx = ThreadProjContext();
    PJPtr poFromCRS(proj_create(poCtx, osFrom.c_str()));
    PJPtr poToCRS(proj_create(poCtx, osTo.c_str()));
    if (!poFromCRS || !poToCRS) return;
    PJPtr poRaw(
        proj_create_crs_to_crs_from_pj(poCtx, poFromCRS.get(), poToCRS.get(), nullptr, nullptr));
    if (!poRaw) return;
    // Longitude / easting first on both sides, whatever the CRS axis order.
    PJPtr poNormal(proj_normalize_for_visualization(poCtx, poRaw.get()));
    if (!poNormal) return;
    psOut->poOperation = std::move(poNormal);
    psOut->eMode = TransformMode::kProj;
}

// The cached transformation of a pair, built on first use; the cache keeps
// the most recently used pairs of this thread.
const CachedTransform& FindTransform(const ProjInfo_t& sFrom, const ProjInfo_t& sTo) {
    PairKey sKey;
    FillKey(sFrom, &sKey.sFrom);
    FillKey(sTo, &sKey.sTo);
    auto& aoCache = ThreadState().Cache();
    for (std::size_t i = 0; i < aoCache.size(); ++i) {
        if (std::memcmp(&aoCache[i]->sKey, &sKey, sizeof(sKey)) == 0) {
            if (i != 0) std::swap(aoCache[0], aoCache[i]);
            return *aoCache[0];
        }
    }
    auto poEntry = std::make_unique<CachedTransform>();
    poEntry->sKey = sKey;
    BuildTransform(sFrom, sTo, poEntry.get());
    if (aoCache.size() == kCacheSize) aoCache.pop_back();
    aoCache.insert(aoCache.begin(), std::move(poEntry));
    return *aoCache[0];
}

}  // namespace
}  // namespace detail
}  // namespace nova

int GCTPTransform(const ProjInfo_t* psFrom, double dfX, double dfY, const ProjInfo_t* psTo,
                  double* pdfX, double* pdfY) {
    using nova::detail::TransformMode;
    if (psFrom == nullptr || psTo == nullptr || pdfX == nullptr || pdfY == nullptr) return -1;
    if (!std::isfinite(dfX) || !std::isfinite(dfY)) return -1;
    const nova::detail::CachedTransform& sTransform = nova::detail::FindTransform(*psFrom, *psTo);
    if (sTransform.eMode == TransformMode::kFail) return -1;
    if (sTransform.bFromGeographic && std::fabs(dfY) > 90.0) return -1;
    if (sTransform.eMode == TransformMode::kIdentity) {
        *pdfX = dfX;
        *pdfY = dfY;
        return 0;
    }
    PJ* poOperation = sTransform.poOperation.get();
    PJ_COORD sCoord = proj_coord(dfX, dfY, 0.0, 0.0);
    sCoord = proj_trans(poOperation, PJ_FWD, sCoord);
    if (!std::isfinite(sCoord.xy.x) || !std::isfinite(sCoord.xy.y) || sCoord.xy.x == HUGE_VAL ||
        sCoord.xy.y == HUGE_VAL) {
        proj_errno_reset(poOperation);
        return -1;
    }
    *pdfX = sCoord.xy.x;
    *pdfY = sCoord.xy.y;
    return 0;
}

int GCTPSimpleTransform(char* pszFrom, double dfX, double dfY, char* pszTo, double* pdfX,
                        double* pdfY) {
    ProjInfo_t sFrom;
    ProjInfo_t sTo;
    if (Geosys2ProjInfo(&sFrom, pszFrom, 0.0, 0.0, 1.0, 1.0) != 0 ||
        Geosys2ProjInfo(&sTo, pszTo, 0.0, 0.0, 1.0, 1.0) != 0) {
        return -1;
    }
    return GCTPTransform(&sFrom, dfX, dfY, &sTo, pdfX, pdfY);
}
