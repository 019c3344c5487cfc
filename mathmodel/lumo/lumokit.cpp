// The math model object: wraps a deep copy of a polynomial or thin plate
// spline record behind the host's math-model interface.
//
// Every exception carries this module's file text, the full text of the
// throwing function and a fixed line number: hosts match on them, so they
// are constants here rather than __LINE__.
#include "lumo_mathmodel.h"

#include <cctype>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>

#include "crs.h"
#include "errors.h"
#include "lumo_lrs.h"
#include "lumo_poly.h"
#include "lumo_rtcs.h"
#include "lumo_srit.h"
#include "lumo_tps.h"
#include "projection.h"
#include "runtime.h"

namespace nova {
namespace mathmodel {
namespace {

constexpr const char* kFile = "mathmodel/lumo/lumokit";

constexpr const char* kFnConstructor =
    "__cdecl nova::mathmodel::LumoMathModel::LumoMathModel(enum "
    "nova::mathmodel::LumoModelType,const void *)";
constexpr const char* kFnInitModel =
    "void __cdecl nova::mathmodel::LumoMathModel::InitModel(int,const void *)";
constexpr const char* kFnCopyFrom =
    "void __cdecl nova::mathmodel::LumoMathModel::CopyFrom(const class "
    "nova::mathmodel::LumoMathModel &)";
constexpr const char* kFnGetNumColumns =
    "int __cdecl nova::mathmodel::LumoMathModel::GetNumColumns(void) const";
constexpr const char* kFnGetNumRows =
    "int __cdecl nova::mathmodel::LumoMathModel::GetNumRows(void) const";
constexpr const char* kFnSetDownsampleFactor =
    "void __cdecl nova::mathmodel::LumoMathModel::SetDownsampleFactor(int)";
constexpr const char* kFnImageToGroundPoint =
    "int __cdecl nova::mathmodel::LumoMathModel::ImageToGround(double,double,double,double "
    "&,double &,bool) const";
constexpr const char* kFnGroundToImagePoint =
    "int __cdecl nova::mathmodel::LumoMathModel::GroundToImage(double,double,double,double "
    "&,double &,bool) const";
constexpr const char* kFnImageToGroundBlock =
    "int __cdecl nova::mathmodel::LumoMathModel::ImageToGround(int,int,int,const float *,const "
    "float *,const float *,float *,float *,unsigned char "
    "*,double,double,double,double,double,bool) const";
constexpr const char* kFnGroundToImageBlock =
    "int __cdecl nova::mathmodel::LumoMathModel::GroundToImage(int,int,int,const float *,const "
    "float *,const float *,float *,float *,unsigned char "
    "*,double,double,double,double,double,bool) const";
constexpr const char* kFnG2IBlockGrid =
    "int __cdecl nova::mathmodel::LumoMathModel::G2IBlockGrid(int,int,int,const float *,const "
    "float *,const float *,float *,float *,unsigned char "
    "*,double,double,double,double,double,bool) const";
constexpr const char* kFnG2IBlockSimple =
    "int __cdecl nova::mathmodel::LumoMathModel::G2IBlockSimple(int,const float *,const float "
    "*,const float *,float *,float *,unsigned char *,double,double,double,double,double,bool) "
    "const";
constexpr const char* kFnI2GBlockGrid =
    "int __cdecl nova::mathmodel::LumoMathModel::I2GBlockGrid(int,int,int,const float *,const "
    "float *,const float *,float *,float *,unsigned char "
    "*,double,double,double,double,double,bool) const";
constexpr const char* kFnI2GBlockSimple =
    "int __cdecl nova::mathmodel::LumoMathModel::I2GBlockSimple(int,const float *,const float "
    "*,const float *,float *,float *,unsigned char *,double,double,double,double,double,bool) "
    "const";
constexpr const char* kFnGetNumGridPoints =
    "int __cdecl nova::mathmodel::LumoMathModel::GetNumGridPoints(int,int) const";

constexpr const char* kUnknownModel =
    "Unknown model, only Toutin, Polynomial, Thin plate spline, ADS, and Radar models are "
    "supported";
constexpr const char* kNotThreadSafe =
    "Internal error: math model marked as non-threadsafe, but implementation not defined";

// Value of GetModelType() for every model of this library.
constexpr MathModelType kLumoModelType = MM_TYPE_LUMO;

[[noreturn]] void ThrowParameter(const char* pszName, const char* pszMessage,
                                 const char* pszFunction, int nLine) {
    throw ParameterException(pszName, 1, "", "", pszMessage, kFile, pszFunction, nLine);
}

// The family's release function for a record of the object's type; null for
// types that own no record.
using RecordRelease = void (*)(void*);

void ReleasePoly(void* p) {
    POLYDeallocate(static_cast<POLYInfo_t*>(p));
}
void ReleaseTps(void* p) {
    TPSDeallocate(static_cast<TPSMInfo_t*>(p));
}
void ReleaseSrit(void* p) {
    LumoFreeSRITInfo(static_cast<SRITInfo_t*>(p));
}
void ReleaseRtcs(void* p) {
    RTCSFreeModel(static_cast<RTCSInfo_t*>(p));
}
void ReleaseLrs(void* p) {
    delete static_cast<LRSOrbitModel_t*>(p);
}

RecordRelease ReleaseFor(LumoModelType eType) {
    switch (eType) {
        case LUMO_MODEL_POLY:
            return &ReleasePoly;
        case LUMO_MODEL_TPS:
            return &ReleaseTps;
        case LUMO_MODEL_SRIT:
            return &ReleaseSrit;
        case LUMO_MODEL_RTCS:
            return &ReleaseRtcs;
        case LUMO_MODEL_LRS:
            return &ReleaseLrs;
        default:
            return nullptr;
    }
}

// A record owned until it is handed to the object, so that a throw between
// its allocation and the end of InitModel/CopyFrom releases it.
struct RecordOwner {
    void* pData = nullptr;
    RecordRelease pfnRelease = nullptr;
    RecordOwner() = default;
    RecordOwner(const RecordOwner&) = delete;
    RecordOwner& operator=(const RecordOwner&) = delete;
    ~RecordOwner() {
        if (pData != nullptr && pfnRelease != nullptr) pfnRelease(pData);
    }
    void* Release() {
        void* p = pData;
        pData = nullptr;
        return p;
    }
};

void* CopyPolyRecord(const void* pSource) {
    RecordOwner owner;
    owner.pfnRelease = &ReleasePoly;
    owner.pData = POLYAllocate();
    POLYCopy(static_cast<POLYInfo_t*>(owner.pData), static_cast<const POLYInfo_t*>(pSource));
    return owner.Release();
}

void* CopySritRecord(const void* pSource) {
    RecordOwner owner;
    owner.pfnRelease = &ReleaseSrit;
    owner.pData = SRITAllocate();
    SRITCopy(static_cast<SRITInfo_t*>(owner.pData), static_cast<const SRITInfo_t*>(pSource));
    return owner.Release();
}

void* CopyRtcsRecord(const void* pSource) {
    RecordOwner owner;
    owner.pfnRelease = &ReleaseRtcs;
    owner.pData = RTCSAllocate();
    if (owner.pData == nullptr) throw OutOfMemoryException(sizeof(RTCSInfo_t));
    RTCSCopy(static_cast<RTCSInfo_t*>(owner.pData), static_cast<const RTCSInfo_t*>(pSource));
    return owner.Release();
}

// The radar record's ground projection as a CRS; null when it has none or
// the factory cannot make one (its exceptions count as no CRS).
ogc::cs::ICRS* RadarCRS(const ogc::IProjInfoFactory* poFactory, const RTCSInfo_t& sModel) {
    if (poFactory == nullptr || sModel.psCOpt == nullptr) return nullptr;
    try {
        return poFactory->CreateCRS(sModel.psCOpt->sProj);
    } catch (...) {
        return nullptr;
    }
}

void* CopyLrsRecord(const void* pSource) {
    LRSOrbitModel_t* psCopy = static_cast<const LRSOrbitModel_t*>(pSource)->Clone();
    if (psCopy == nullptr) throw OutOfMemoryException(sizeof(LRSOrbitModel_t));
    return psCopy;
}

void* CopyTpsRecord(const void* pSource) {
    RecordOwner owner;
    owner.pfnRelease = &ReleaseTps;
    owner.pData = TPSAllocate(nullptr);
    TPSCopy(static_cast<TPSMInfo_t*>(owner.pData), static_cast<const TPSMInfo_t*>(pSource));
    return owner.Release();
}

// The projection string of a record: a fixed buffer that need not be
// terminated within its size.
std::string FixedText(const char* pszBuffer, std::size_t nBufferSize) {
    if (pszBuffer == nullptr) return std::string();
    return std::string(pszBuffer, strnlen(pszBuffer, nBufferSize - 1));
}

// Projection description of a polynomial or spline record: the projection
// string, completed with the record's parameters when the string alone does
// not define the projection (TM, LCC, PS, MER).
void FillEmpiricalProjInfo(ProjInfo_t* psQ, const std::string& osGeosys,
                           const ProjInfo_t* psProjInfo) {
    Geosys2ProjInfo(psQ, osGeosys.c_str(), 0.0, 0.0, 1.0, 1.0);
    if (psProjInfo == nullptr || RequiresProjInfo(DecodeGeosys(psQ->szProj, nullptr)) != 1) return;
    std::unique_ptr<char, FreeDeleter> poParms(ProjInfo2Parms(psProjInfo));
    if (poParms) ProjParms2Info(poParms.get(), psQ);
}

// Projection description of a rigorous record: its own ground projection
// text, else its segment's, switched to the record's conformal working
// projection when that one is not conformal or is a Lambert conformal conic.
void FillRigorousProjInfo(ProjInfo_t* psP, const SRITInfo_t& sModel) {
    const std::string osAuxB = FixedText(sModel.szAuxB, SRIT_AUX_TEXT_SIZE);
    if (!osAuxB.empty()) {
        Geosys2ProjInfo(psP, osAuxB.c_str(), 0.0, 0.0, 1.0, 1.0);
        if (sModel.psProjInfo != nullptr &&
            RequiresProjInfo(DecodeGeosys(psP->szProj, nullptr)) != 0) {
            std::unique_ptr<char, FreeDeleter> poParms(ProjInfo2Parms(sModel.psProjInfo));
            if (poParms) ProjParms2Info(poParms.get(), psP);
        }
    } else if (sModel.psEphemeris != nullptr) {
        const std::string osGeosys = FixedText(sModel.psEphemeris->szGeosys, EPH_GEOSYS_SIZE);
        if (!osGeosys.empty()) Geosys2ProjInfo(psP, osGeosys.c_str(), 0.0, 0.0, 1.0, 1.0);
    }
    // By kind, so that an EPSG code of a Lambert conformal conic counts too.
    const bool bLcc = DecodeGeosys(psP->szProj, nullptr) == NOVA_PROJ_LCC;
    if (IsConformal(psP->szProj) == 0 || bLcc) {
        Geosys2ProjInfo(psP, FixedText(sModel.szAuxA, SRIT_AUX_TEXT_SIZE).c_str(), 0.0, 0.0, 1.0,
                        1.0);
    }
}

// A record its family's validation refuses is not wrapped: the object would
// report its values as positions.
void RequireUsable(const std::string& osProblem, int nLine) {
    if (!osProblem.empty()) {
        ThrowParameter("pData", ("The model cannot be evaluated: " + osProblem).c_str(),
                       kFnInitModel, nLine);
    }
}

void LogPointFailure(const std::string& osMessage, int nLine) noexcept {
    try {
        if (lumo::TraceOn()) lumo::Trace(1, __FILE__, nLine, "%s", osMessage.c_str());
    } catch (...) {
        // The log is best effort: a point operation never throws.
    }
}

}  // namespace

LumoMathModel::LumoMathModel() {}

LumoMathModel::LumoMathModel(LumoModelType eType, const void* pData) {
    Init();
    int nCode = 0;
    switch (eType) {
        case LUMO_MODEL_AP:
            nCode = 1;
            break;
        case LUMO_MODEL_SRIT:
            nCode = 2;
            break;
        case LUMO_MODEL_POLY:
            nCode = 4;
            break;
        case LUMO_MODEL_TPS:
            nCode = 5;
            break;
        case LUMO_MODEL_RF:
            nCode = 6;
            break;
        case LUMO_MODEL_RTCS:
            nCode = 7;
            break;
        case LUMO_MODEL_LRS:
            nCode = 3;
            break;
        case LUMO_MODEL_CODE10:
            nCode = 10;
            break;
        case LUMO_MODEL_CODE12:
            nCode = 12;
            break;
        default:
            ThrowParameter("eType", "Unknown model code passed to LumoMathModel constructor",
                           kFnConstructor, 105);
    }
    InitModel(nCode, pData);
}

LumoMathModel::LumoMathModel(int nModelCode, const void* pData) {
    Init();
    InitModel(nModelCode, pData);
}

LumoMathModel::LumoMathModel(const LumoMathModel& oOther) : IMathModel(oOther) {
    Init();
    CopyFrom(oOther);
}

LumoMathModel::~LumoMathModel() {
    ClearModel();
}

void LumoMathModel::Init() {
    mpData = nullptr;
    meType = LUMO_MODEL_AP;
    mnModelCode = 1;
    mpoCRS = nullptr;
    mnDownsampleFactor = 1;
    mbThreadSafe = true;
    mpoMutex = nullptr;
}

// Builds everything in local owners and stores it only once nothing can throw
// any more, so a failed construction leaks nothing.
void LumoMathModel::InitModel(int nModelCode, const void* pData) {
    const ogc::IProjInfoFactory* poFactory = ogc::ProjectionEngine::GetProjInfoFactory(3);
    if (pData == nullptr) ThrowParameter("pData", "null pointer", kFnInitModel, 312);

    mnModelCode = nModelCode;
    mnDownsampleFactor = 1;
    ProjInfo_t sP;  // projection of the rigorous branch
    InitProjInfo(&sP, 1);
    ProjInfo_t sQ;  // projection of the other branches
    InitProjInfo(&sQ, 0);
    // Heights above the ellipsoid; the rigorous and radar branches may
    // choose orthometric heights.
    ogc::cs::DatumType eVertical = ogc::cs::CS_VD_Ellipsoidal;

    RecordOwner oRecord;
    LumoModelType eType = LUMO_MODEL_AP;
    bool bRigorous = false;
    switch (nModelCode) {
        case 2: {
            oRecord.pfnRelease = &ReleaseSrit;
            oRecord.pData = CopySritRecord(pData);
            const auto* psSrit = static_cast<const SRITInfo_t*>(oRecord.pData);
            RequireUsable(SRITValidate(psSrit), __LINE__);
            mnDownsampleFactor = psSrit->anAux[0];
            FillRigorousProjInfo(&sP, *psSrit);
            bRigorous = true;
            eType = LUMO_MODEL_SRIT;
            eVertical = ogc::cs::CS_VD_Orthometric;
            break;
        }
        case 4: {
            oRecord.pfnRelease = &ReleasePoly;
            oRecord.pData = CopyPolyRecord(pData);
            const auto* psPoly = static_cast<const POLYInfo_t*>(oRecord.pData);
            RequireUsable(POLYValidate(psPoly), __LINE__);
            FillEmpiricalProjInfo(&sQ, FixedText(psPoly->pszGeosys, POLY_GEOSYS_SIZE),
                                  psPoly->psProjInfo);
            eType = LUMO_MODEL_POLY;
            break;
        }
        case 5: {
            oRecord.pfnRelease = &ReleaseTps;
            oRecord.pData = CopyTpsRecord(pData);
            const auto* psTps = static_cast<const TPSMInfo_t*>(oRecord.pData);
            RequireUsable(TPSValidate(psTps), __LINE__);
            FillEmpiricalProjInfo(&sQ, FixedText(psTps->pszGeosys, TPS_GEOSYS_SIZE),
                                  psTps->psProjInfo);
            eType = LUMO_MODEL_TPS;
            break;
        }
        case 7: {
            oRecord.pfnRelease = &ReleaseRtcs;
            oRecord.pData = CopyRtcsRecord(pData);
            const auto* psRtcs = static_cast<const RTCSInfo_t*>(oRecord.pData);
            mnDownsampleFactor = psRtcs->nDownsample;
            eVertical = psRtcs->osHeightRef == "M" ? ogc::cs::CS_VD_Orthometric
                                                   : ogc::cs::CS_VD_Ellipsoidal;
            eType = LUMO_MODEL_RTCS;
            break;
        }
        case 3: {
            oRecord.pfnRelease = &ReleaseLrs;
            oRecord.pData = CopyLrsRecord(pData);
            Geosys2ProjInfo(&sQ, "LONG/LAT D000", 0.0, 0.0, 1.0, 1.0);
            eType = LUMO_MODEL_LRS;
            break;
        }
        default:
            ThrowParameter("eType", kUnknownModel, kFnInitModel, 466);
    }

    // Geographic and projected descriptions have a CRS; unit-only ones
    // ("METRE", "PIXEL") do not.
    ogc::CRSPtr poHorizontal(
        eType == LUMO_MODEL_RTCS
            ? RadarCRS(poFactory, *static_cast<const RTCSInfo_t*>(oRecord.pData))
            : (poFactory != nullptr ? poFactory->CreateCRS(bRigorous ? sP : sQ) : nullptr));
    if (!poHorizontal && bRigorous) {
        ThrowParameter("pData", "Could not read the coordinate system for the math model",
                       kFnInitModel, 373);
    }
    if (!poHorizontal)
        throw DataException("Failed to get a CRS for the math model!", kFile, kFnInitModel, 473);
    ogc::CRSPtr poCompound(ogc::utils::CreateCompoundCS(poHorizontal.get(), eVertical));

    ClearModel();
    mnModelCode = nModelCode;
    mpData = oRecord.Release();
    meType = eType;
    mpoCRS = poCompound.release();
    mpoMutex = nullptr;
}

void LumoMathModel::CopyFrom(const LumoMathModel& oOther) {
    if (&oOther == this) return;
    ClearModel();
    ogc::CRSPtr poCRS(oOther.mpoCRS != nullptr ? oOther.mpoCRS->Clone() : nullptr);
    meType = oOther.meType;
    mnModelCode = oOther.mnModelCode;
    mnDownsampleFactor = oOther.mnDownsampleFactor;

    RecordOwner oRecord;
    switch (meType) {
        case LUMO_MODEL_POLY:
            oRecord.pfnRelease = &ReleasePoly;
            oRecord.pData = CopyPolyRecord(oOther.mpData);
            break;
        case LUMO_MODEL_TPS:
            oRecord.pfnRelease = &ReleaseTps;
            oRecord.pData = CopyTpsRecord(oOther.mpData);
            break;
        case LUMO_MODEL_SRIT:
            oRecord.pfnRelease = &ReleaseSrit;
            oRecord.pData = CopySritRecord(oOther.mpData);
            break;
        case LUMO_MODEL_RTCS:
            oRecord.pfnRelease = &ReleaseRtcs;
            oRecord.pData = CopyRtcsRecord(oOther.mpData);
            break;
        case LUMO_MODEL_LRS:
            oRecord.pfnRelease = &ReleaseLrs;
            oRecord.pData = CopyLrsRecord(oOther.mpData);
            break;
        default:
            ThrowParameter("eType", "Model not supported", kFnCopyFrom, 221);
    }
    std::unique_ptr<threading::Mutex> poMutex;
    if (!oOther.mbThreadSafe) poMutex = std::make_unique<threading::Mutex>();

    mpData = oRecord.Release();
    mpoCRS = poCRS.release();
    mbThreadSafe = oOther.mbThreadSafe;
    mpoMutex = poMutex.release();
}

void LumoMathModel::ClearModel() {
    if (mpData != nullptr) {
        const RecordRelease pfnRelease = ReleaseFor(meType);
        if (pfnRelease != nullptr) pfnRelease(mpData);
    }
    mnModelCode = 1;
    mpData = nullptr;
    meType = LUMO_MODEL_AP;
    if (mpoCRS != nullptr) mpoCRS->Release();
    mpoCRS = nullptr;
    delete mpoMutex;
    mpoMutex = nullptr;
}

const ogc::cs::ICRS* LumoMathModel::GetCRS() const {
    return mpoCRS;
}

MathModelType LumoMathModel::GetModelType() const {
    return kLumoModelType;
}

std::string LumoMathModel::GetModelName() const {
    return "Lumo";
}

int LumoMathModel::GetNumColumns() const {
    switch (meType) {
        case LUMO_MODEL_POLY:
            return static_cast<const POLYInfo_t*>(mpData)->nPixels;
        case LUMO_MODEL_TPS:
            return static_cast<const TPSMInfo_t*>(mpData)->nPixels;
        case LUMO_MODEL_SRIT: {
            const auto* psSrit = static_cast<const SRITInfo_t*>(mpData);
            if (psSrit == nullptr || psSrit->psEphemeris == nullptr) {
                throw DataException("Invalid SRITInfo_t object", kFile, kFnGetNumColumns, 528);
            }
            return psSrit->psEphemeris->nNumPixels;
        }
        case LUMO_MODEL_RTCS: {
            const auto* psRtcs = static_cast<const RTCSInfo_t*>(mpData);
            if (psRtcs == nullptr || psRtcs->psCOpt == nullptr) {
                throw DataException("Invalid RTCSInfo_t object", kFile, kFnGetNumColumns, 549);
            }
            return psRtcs->psCOpt->sLines.nPixels;
        }
        // The orbit model cannot report its size.
        default:
            ThrowParameter("eType", kUnknownModel, kFnGetNumColumns, 563);
    }
}

int LumoMathModel::GetNumRows() const {
    switch (meType) {
        case LUMO_MODEL_POLY:
            return static_cast<const POLYInfo_t*>(mpData)->nLines;
        case LUMO_MODEL_TPS:
            return static_cast<const TPSMInfo_t*>(mpData)->nLines;
        case LUMO_MODEL_SRIT: {
            const auto* psSrit = static_cast<const SRITInfo_t*>(mpData);
            if (psSrit == nullptr || psSrit->psEphemeris == nullptr) {
                throw DataException("Invalid SRITInfo_t object", kFile, kFnGetNumRows, 582);
            }
            return psSrit->psEphemeris->nNumLines;
        }
        case LUMO_MODEL_RTCS: {
            const auto* psRtcs = static_cast<const RTCSInfo_t*>(mpData);
            if (psRtcs == nullptr || psRtcs->psCOpt == nullptr) {
                throw DataException("Invalid RTCSInfo_t object", kFile, kFnGetNumRows, 603);
            }
            return psRtcs->psCOpt->sLines.nLines;
        }
        default:
            ThrowParameter("eType", kUnknownModel, kFnGetNumRows, 614);
    }
}

int LumoMathModel::GetDownsampleFactor() const {
    return mnDownsampleFactor;
}

int LumoMathModel::GetMinValidHeight(double& /*dfHeight*/) const {
    return -1;
}

int LumoMathModel::GetMaxValidHeight(double& /*dfHeight*/) const {
    return -1;
}

bool LumoMathModel::IsHeightDependent() const {
    return true;
}

bool LumoMathModel::IsEqual(const IMathModel* poOther) const {
    if (poOther == nullptr || poOther->GetModelType() != kLumoModelType) return false;
    const auto* poLumo = dynamic_cast<const LumoMathModel*>(poOther);
    if (poLumo == nullptr || poLumo->meType != meType) return false;
    return poLumo == this;
}

int LumoMathModel::ImageToGround(double dfPixel, double dfLine, double dfZ, double& dfX,
                                 double& dfY, bool /*bFlag*/) const {
    try {
        if (!mbThreadSafe) throw Exception(kNotThreadSafe, kFile, kFnImageToGroundPoint, 639);
        return GenImg2Geo(mnModelCode, mpData, dfPixel, dfLine, dfZ, &dfX, &dfY) == 1 ? 0 : -1;
    } catch (...) {
        LogPointFailure(
            FormatString("GenImg2Geo failed for type %d, the results may be invalid", mnModelCode),
            655);
        return -1;
    }
}

int LumoMathModel::GroundToImage(double dfX, double dfY, double dfZ, double& dfPixel,
                                 double& dfLine, bool /*bFlag*/) const {
    try {
        if (!mbThreadSafe) throw Exception(kNotThreadSafe, kFile, kFnGroundToImagePoint, 680);
        // A rigorous model maps by the exact inverse of its image-to-ground
        // equations, so that orthorectification and ImageToGround agree;
        // its closed form misses them by tenths of a pixel off nadir.
        if (mnModelCode == LUMO_CODE_SRIT) {
            return SRITGeo2ImgExact(static_cast<const SRITInfo_t*>(mpData), dfX, dfY, dfZ, &dfPixel,
                                    &dfLine) == 1
                       ? 0
                       : -1;
        }
        return GenGeo2Img(mnModelCode, mpData, dfX, dfY, dfZ, &dfPixel, &dfLine) == 1 ? 0 : -1;
    } catch (...) {
        LogPointFailure(
            FormatString("GenGeo2Img failed for type %d, the results may be hosed", mnModelCode),
            695);
        return -1;
    }
}

int LumoMathModel::ImageToGround(double dfLine, double dfZ, int nCount, const double* padfPixel,
                                 double* padfX, double* padfY, int* panValid, bool bFlag) const {
    return mathmodel::ImageToGround(this, dfLine, dfZ, nCount, padfPixel, padfX, padfY, panValid,
                                    bFlag);
}

int LumoMathModel::GroundToImage(double dfY, double dfZ, int nCount, const double* padfX,
                                 double* padfPixel, double* padfLine, int* panValid,
                                 bool bFlag) const {
    return mathmodel::GroundToImage(this, dfY, dfZ, nCount, padfX, padfPixel, padfLine, panValid,
                                    bFlag);
}

int LumoMathModel::ImageToGround(int nCols, int nRows, int nGridStep, const float* pafPixel,
                                 const float* pafLine, const float* pafZ, float* pafX, float* pafY,
                                 unsigned char* pabyValid, double dfOriginPixel,
                                 double dfOriginLine, double dfStepPixel, double dfStepLine,
                                 double dfTolerance, bool bFlag) const {
    if (!mbThreadSafe) throw Exception(kNotThreadSafe, kFile, kFnImageToGroundBlock, 994);
    return mathmodel::ImageToGround(this, nCols, nRows, nGridStep, pafPixel, pafLine, pafZ, pafX,
                                    pafY, pabyValid, dfOriginPixel, dfOriginLine, dfStepPixel,
                                    dfStepLine, dfTolerance, bFlag);
}

int LumoMathModel::GroundToImage(int nCols, int nRows, int nGridStep, const float* pafX,
                                 const float* pafY, const float* pafZ, float* pafPixel,
                                 float* pafLine, unsigned char* pabyValid, double dfOriginX,
                                 double dfOriginY, double dfStepX, double dfStepY,
                                 double dfTolerance, bool bFlag) const {
    if (!mbThreadSafe) throw Exception(kNotThreadSafe, kFile, kFnGroundToImageBlock, 777);
    return mathmodel::GroundToImage(this, nCols, nRows, nGridStep, pafX, pafY, pafZ, pafPixel,
                                    pafLine, pabyValid, dfOriginX, dfOriginY, dfStepX, dfStepY,
                                    dfTolerance, bFlag);
}

// The block helpers are kept for a model that is not thread-safe; no model
// of this library is, so they only report that.
int LumoMathModel::G2IBlockGrid(int, int, int, const float*, const float*, const float*, float*,
                                float*, unsigned char*, double, double, double, double, double,
                                bool) const {
    throw Exception(kNotThreadSafe, kFile, kFnG2IBlockGrid, 900);
}

int LumoMathModel::G2IBlockSimple(int, const float*, const float*, const float*, float*, float*,
                                  unsigned char*, double, double, double, double, double,
                                  bool) const {
    throw Exception(kNotThreadSafe, kFile, kFnG2IBlockSimple, 826);
}

int LumoMathModel::I2GBlockGrid(int, int, int, const float*, const float*, const float*, float*,
                                float*, unsigned char*, double, double, double, double, double,
                                bool) const {
    throw Exception(kNotThreadSafe, kFile, kFnI2GBlockGrid, 1117);
}

int LumoMathModel::I2GBlockSimple(int, const float*, const float*, const float*, float*, float*,
                                  unsigned char*, double, double, double, double, double,
                                  bool) const {
    throw Exception(kNotThreadSafe, kFile, kFnI2GBlockSimple, 1042);
}

IMathModel* LumoMathModel::Clone() const {
    return new LumoMathModel(*this);
}

void LumoMathModel::SetDownsampleFactor(int nFactor) {
    mnDownsampleFactor = nFactor;
    switch (meType) {
        case LUMO_MODEL_POLY:
        case LUMO_MODEL_TPS:
            if (nFactor != 1) {
                throw DataException("Downsample factor not supported for the current model type",
                                    kFile, kFnSetDownsampleFactor, 1277);
            }
            return;
        case LUMO_MODEL_SRIT:
            if (mpData != nullptr) static_cast<SRITInfo_t*>(mpData)->anAux[0] = nFactor;
            return;
        case LUMO_MODEL_RTCS:
            if (mpData != nullptr) static_cast<RTCSInfo_t*>(mpData)->nDownsample = nFactor;
            return;
        default:
            ThrowParameter("eType", kUnknownModel, kFnSetDownsampleFactor, 1289);
    }
}

LumoModelType LumoMathModel::GetLumoModelType() const {
    return meType;
}

const void* LumoMathModel::GetModel() const {
    return mpData;
}

// Number of grid nodes along a side of nSize points sampled every nStep
// points, both ends included.
int LumoMathModel::GetNumGridPoints(int nSize, int nStep) const {
    // A step below 1 would divide by zero or count backwards.
    if (nStep < 1) {
        throw ParameterException("nStep", 1, "", "", FormatString("grid step %d is below 1", nStep),
                                 kFile, kFnGetNumGridPoints, __LINE__);
    }
    if (nStep == 1 || nSize == 1 || nSize == 2) return nSize;
    return nSize / nStep + (nSize % nStep != 0 ? 2 : 1);
}

}  // namespace mathmodel
}  // namespace nova
