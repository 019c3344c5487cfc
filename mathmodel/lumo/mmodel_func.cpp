// Ephemeris segments: deep copy, assignment between model records and release.
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <type_traits>
#include <vector>

#include "crs.h"
#include "lumo_ephemeris.h"
#include "lumo_gcp.h"
#include "record_check.h"
#include "runtime.h"

namespace {

template <typename T>
using HostPtr = std::unique_ptr<T, nova::FreeDeleter>;

template <typename T>
T* AllocZeroed(std::int64_t nCount) {
    return static_cast<T*>(HCalloc(static_cast<std::uint64_t>(nCount), sizeof(T)));
}

// The line table of each sub-record kind.
int32_t& LineCount(AttitudeData_t& s) {
    return s.nNumAttitudeLines;
}
int32_t& LineCount(RadarData_t& s) {
    return s.nNumLinePositions;
}
int32_t& LineCount(AvhrrData_t& s) {
    return s.nNumScanLines;
}
AttitudeLine_t*& LineArray(AttitudeData_t& s) {
    return s.pAttitudeLines;
}
RadarLine_t*& LineArray(RadarData_t& s) {
    return s.pLinePositions;
}
AvhrrLine_t*& LineArray(AvhrrData_t& s) {
    return s.pScanLines;
}

// Elements that may be read from a sub-record's line array: none when the
// array is missing or the count is below 1, so a count that disagrees with its
// array is never followed.
template <typename Sub>
int32_t UsableLineCount(Sub& s) {
    return (LineArray(s) != nullptr && LineCount(s) > 0) ? LineCount(s) : 0;
}

// A separately owned copy of a sub-record and its lines.
template <typename Sub>
void* CloneSubRecord(void* pvSrc) {
    Sub& sSrc = *static_cast<Sub*>(pvSrc);
    using Line = std::remove_pointer_t<std::remove_reference_t<decltype(LineArray(sSrc))>>;
    HostPtr<Sub> poCopy(AllocZeroed<Sub>(1));
    std::memcpy(poCopy.get(), &sSrc, sizeof(Sub));
    LineArray(*poCopy) = nullptr;
    // The count is copied as it is; only lines that exist are copied.
    const int32_t nLines = UsableLineCount(sSrc);
    if (nLines > 0) {
        Line* pasLines = AllocZeroed<Line>(nLines);
        std::memcpy(pasLines, LineArray(sSrc), sizeof(Line) * static_cast<std::size_t>(nLines));
        LineArray(*poCopy) = pasLines;
    }
    return poCopy.release();
}

// Largest line or pixel count of an image or a line table: far beyond any
// scene, low enough that a corrupt count is refused rather than followed.
constexpr int32_t kMaxLineCount = 10000000;

std::string CheckCount(const std::string& osField, int32_t nCount) {
    if (nCount >= 0 && nCount <= kMaxLineCount) return "";
    return lumo::FieldProblem(osField, nCount, "a count must lie in 0..10000000");
}

template <typename Sub>
std::string CheckSubRecord(void* pvSub, const char* pszCount, const char* pszLines) {
    Sub& s = *static_cast<Sub*>(pvSub);
    std::string problem = CheckCount(pszCount, LineCount(s));
    if (problem.empty() && LineCount(s) > 0 && LineArray(s) == nullptr) {
        problem = lumo::FieldProblem(
            pszCount, LineCount(s),
            std::string("the count has no line table (") + pszLines + " is null)");
    }
    return problem;
}

template <typename Sub>
void FreeSubRecord(void* pvSub) {
    Sub* psSub = static_cast<Sub*>(pvSub);
    std::free(LineArray(*psSub));
    std::free(psSub);
}

template <typename Sub>
bool HasLineArray(void* pvSub) {
    return LineArray(*static_cast<Sub*>(pvSub)) != nullptr;
}

// Operations on the sub-record of one kind.
struct OrbitKindOps {
    void* (*pfnClone)(void*);
    void (*pfnFree)(void*);
    bool (*pfnHasLines)(void*);
};

template <typename Sub>
constexpr OrbitKindOps OpsOf() {
    return {&CloneSubRecord<Sub>, &FreeSubRecord<Sub>, &HasLineArray<Sub>};
}

// Indexed by nOrbitType; kind 0 has no sub-record.
constexpr OrbitKindOps kOrbitKinds[] = {
    {nullptr, nullptr, nullptr},
    OpsOf<AttitudeData_t>(),
    OpsOf<RadarData_t>(),
    OpsOf<AvhrrData_t>(),
};

// Operations of a known sub-record kind; null for any other kind.
const OrbitKindOps* OpsFor(int32_t nOrbitType) {
    if (nOrbitType < EPH_ORBIT_ATTITUDE || nOrbitType > EPH_ORBIT_AVHRR) return nullptr;
    return &kOrbitKinds[nOrbitType];
}

// The sub-record a segment's holder points to; null when there is none.
void* SubRecordOf(const EphemerisSeg_t& sSeg) {
    return sSeg.ppOrbitData != nullptr ? *sSeg.ppOrbitData : nullptr;
}

// A new holder pointing to a copy of the source's sub-record; null when the
// source has no sub-record of a known kind, or when bNeedLines is set and the
// source sub-record has no line array.
void** CloneOrbit(const EphemerisSeg_t& sSrc, bool bNeedLines) {
    const OrbitKindOps* psOps = OpsFor(sSrc.nOrbitType);
    void* pvSrcSub = SubRecordOf(sSrc);
    if (psOps == nullptr || pvSrcSub == nullptr) return nullptr;
    if (bNeedLines && !psOps->pfnHasLines(pvSrcSub)) return nullptr;
    HostPtr<void*> poHolder(AllocZeroed<void*>(1));
    *poHolder = psOps->pfnClone(pvSrcSub);
    return poHolder.release();
}

// Frees the holder and, for a known kind, the sub-record and its lines. A
// sub-record of an unknown kind cannot be released safely and is left alone.
void ReleaseOrbit(EphemerisSeg_t* psSeg) {
    if (psSeg->ppOrbitData != nullptr) {
        const OrbitKindOps* psOps = OpsFor(psSeg->nOrbitType);
        if (psOps != nullptr && *psSeg->ppOrbitData != nullptr) {
            psOps->pfnFree(*psSeg->ppOrbitData);
            *psSeg->ppOrbitData = nullptr;
        }
        std::free(psSeg->ppOrbitData);
        psSeg->ppOrbitData = nullptr;
    }
    psSeg->nOrbitType = EPH_ORBIT_NONE;
}

// Copies every field of the main record except the orbit kind and holder.
void CopyMainFields(EphemerisSeg_t* psDst, const EphemerisSeg_t& sSrc) {
    const int32_t nOrbitType = psDst->nOrbitType;
    void** ppOrbitData = psDst->ppOrbitData;
    std::memcpy(psDst, &sSrc, sizeof(EphemerisSeg_t));
    psDst->nOrbitType = nOrbitType;
    psDst->ppOrbitData = ppOrbitData;
}

}  // namespace

EphemerisSeg_t* EphemerisSegDuplicate(const EphemerisSeg_t* psSrc) {
    if (psSrc == nullptr) return nullptr;
    HostPtr<EphemerisSeg_t> poCopy(AllocZeroed<EphemerisSeg_t>(1));
    std::memcpy(poCopy.get(), psSrc, sizeof(EphemerisSeg_t));
    // The copy gets a holder of its own, never the source's.
    poCopy->ppOrbitData = CloneOrbit(*psSrc, false);
    return poCopy.release();
}

std::string EphemerisSegValidate(const EphemerisSeg_t* psSeg) {
    if (psSeg == nullptr) return "the segment is null";
    const EphemerisSeg_t& s = *psSeg;
    std::string problem = CheckCount("nNumLines", s.nNumLines);
    if (problem.empty()) problem = CheckCount("nNumPixels", s.nNumPixels);
    if (!problem.empty()) return problem;
    if (s.nLevelConvForm != 0 && s.nLevelConvForm != 20 && s.nLevelConvForm != 39) {
        return lumo::FieldProblem("nLevelConvForm", s.nLevelConvForm, "must be 0, 20 or 39");
    }
    if (s.ppOrbitData == nullptr) return "";
    if (s.nOrbitType == EPH_ORBIT_NONE) {
        return lumo::FieldProblem("nOrbitType", 0, "the segment holds an orbit sub-record");
    }
    if (OpsFor(s.nOrbitType) == nullptr) {
        return lumo::FieldProblem("nOrbitType", s.nOrbitType,
                                  "an orbit sub-record must be of kind 1, 2 or 3");
    }
    void* pvSub = *s.ppOrbitData;
    if (pvSub == nullptr) return "";
    switch (s.nOrbitType) {
        case EPH_ORBIT_ATTITUDE:
            return CheckSubRecord<AttitudeData_t>(pvSub, "nNumAttitudeLines", "pAttitudeLines");
        case EPH_ORBIT_RADAR:
            return CheckSubRecord<RadarData_t>(pvSub, "nNumLinePositions", "pLinePositions");
        default:
            return CheckSubRecord<AvhrrData_t>(pvSub, "nNumScanLines", "pScanLines");
    }
}

void LumoSatEphemerisFree(EphemerisSeg_t* psSeg) {
    if (psSeg == nullptr) return;
    ReleaseOrbit(psSeg);
    std::free(psSeg);
}

void EphemerisSegFreeOrbit(EphemerisSeg_t* psSeg) {
    if (psSeg == nullptr) return;
    ReleaseOrbit(psSeg);
}

void EphemerisSegCopyInto(EphemerisSeg_t** ppsDst, EphemerisSeg_t* const* ppsSrc) {
    if (ppsDst == nullptr || ppsSrc == nullptr || ppsDst == ppsSrc) return;
    const EphemerisSeg_t* psSrc = *ppsSrc;
    // Two records sharing one segment are already equal; copying would free
    // the source's sub-record before reading it.
    if (*ppsDst == psSrc) return;
    if (psSrc == nullptr) {
        LumoSatEphemerisFree(*ppsDst);
        *ppsDst = nullptr;
        return;
    }
    // Build everything new first so that a failed allocation leaves the
    // destination as it was.
    HostPtr<EphemerisSeg_t> poNewSeg;
    if (*ppsDst == nullptr) poNewSeg.reset(AllocZeroed<EphemerisSeg_t>(1));
    void** ppNewOrbit = CloneOrbit(*psSrc, true);

    EphemerisSeg_t* psDst = poNewSeg ? poNewSeg.release() : *ppsDst;
    *ppsDst = psDst;
    CopyMainFields(psDst, *psSrc);
    ReleaseOrbit(psDst);
    psDst->ppOrbitData = ppNewOrbit;
    psDst->nOrbitType = psSrc->nOrbitType;
}

// ---------------------------------------------------------------------------
// Control point datum conversion to WGS 84 longitude, latitude and
// ellipsoidal height, through the host's coordinate reference systems.
// ---------------------------------------------------------------------------

namespace {

constexpr const char* kGcpSourceFile = "mathmodel/lumo/mmodel_func";
constexpr const char* kGcpFunctionText =
    "void __cdecl ConvertGcpsToWgs84Ell(const struct ProjInfo_t &,const class "
    "std::basic_string<char,struct std::char_traits<char>,class std::allocator<char> >,class "
    "std::vector<struct ControlPoint_t,class std::allocator<struct ControlPoint_t> > &)";
constexpr int kGcpNoTransformLine = 217;

// The projection's georeferencing text, for messages (the record's text may
// lack a terminator).
std::string GeosysText(const ProjInfo_t& sProj) {
    return std::string(sProj.szProj, strnlen(sProj.szProj, sizeof(sProj.szProj)));
}

}  // namespace

// The height reference is taken by value: that is the exported signature.
void ConvertGcpsToWgs84Ell(const ProjInfo_t& sProj,
                           std::string osHeightRef,  // NOLINT(performance-unnecessary-value-param)
                           std::vector<ControlPoint_t>& aoGcps) {
    namespace ogc = nova::ogc;
    const ogc::cs::DatumType eVertical =
        osHeightRef == "M" ? ogc::cs::CS_VD_Orthometric : ogc::cs::CS_VD_Ellipsoidal;

    const ogc::CRSPtr poHorizontal(
        ogc::ProjectionEngine::GetProjInfoFactory(ogc::kProjectionEngineProj)->CreateCRS(sProj));
    if (!poHorizontal) {
        throw nova::ParameterException(
            "sProj", 1, "", "",
            "Could not transform GCPs to WGS84 Ellipsoidal: the projection \"" + GeosysText(sProj) +
                "\" has no coordinate reference system",
            kGcpSourceFile, kGcpFunctionText, __LINE__);
    }
    const ogc::CRSPtr poSource(ogc::utils::CreateCompoundCS(poHorizontal.get(), eVertical));
    const ogc::CRSPtr poTarget(
        ogc::ProjectionEngine::GetCSAuthorityFactory(ogc::kProjectionEngineProj)
            ->CreateWGS84Ellipsoidal());
    const ogc::MathTransformPtr poTransform(
        ogc::utils::CreateCRSTransform(poSource.get(), poTarget.get(), 0.0));
    if (!poTransform) {
        throw nova::Exception("Could not transform GCPs to WGS84 Ellipsoidal", kGcpSourceFile,
                              kGcpFunctionText, kGcpNoTransformLine);
    }

    // Converted into a copy and committed only when every point succeeded:
    // a point that fails must neither keep its old coordinates under the new
    // datum nor leave the vector half converted.
    std::vector<ControlPoint_t> aoConverted(aoGcps);
    for (std::size_t i = 0; i < aoConverted.size(); ++i) {
        ControlPoint_t& sPoint = aoConverted[i];
        if (!poTransform->TransformPoint(sPoint.dfGroundX, sPoint.dfGroundY, sPoint.dfGroundZ,
                                         sPoint.dfGroundX, sPoint.dfGroundY, sPoint.dfGroundZ)) {
            throw nova::DataException(
                nova::FormatString("Could not transform GCP %zu (X %.17g, Y %.17g, Z %.17g) in "
                                   "\"%s\" to WGS84 Ellipsoidal",
                                   i + 1, sPoint.dfGroundX, sPoint.dfGroundY, sPoint.dfGroundZ,
                                   GeosysText(sProj).c_str()),
                kGcpSourceFile, kGcpFunctionText, __LINE__);
        }
    }
    aoGcps.swap(aoConverted);
}
