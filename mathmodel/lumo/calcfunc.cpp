// Generic dispatch of point transforms by model code.
#include "lumo_dispatch.h"
#include "lumo_poly.h"
#include "mathmodel_core.h"

namespace {

constexpr int kFirstCode = 1;
constexpr int kLastCode = 12;

bool IsKnownCode(int nModelCode) { return nModelCode >= kFirstCode && nModelCode <= kLastCode; }

bool IsModelObjectCode(int nModelCode) { return nModelCode >= 10 && nModelCode <= 12; }

// A null record or output would crash the family; it is refused as a failed
// transform instead of being dereferenced.
bool HasRecordAndOutputs(const void* pModel, const double* pdfOut1, const double* pdfOut2) {
    return pModel != nullptr && pdfOut1 != nullptr && pdfOut2 != nullptr;
}

const nova::mathmodel::IMathModel* AsModelObject(void* pModel) {
    return static_cast<const nova::mathmodel::IMathModel*>(pModel);
}

}  // namespace

extern "C" LUMO_API const char* LumoVersion() { return LUMO_VERSION_STRING; }

int GenGeo2Img(int nModelCode, void* pModel, double dfX, double dfY, double dfZ, double* pdfPixel,
               double* pdfLine) {
    if (!IsKnownCode(nModelCode)) return 0;
    if (!HasRecordAndOutputs(pModel, pdfPixel, pdfLine)) return 0;
    switch (nModelCode) {
        case LUMO_CODE_POLY:
            POLYGeo2Img(static_cast<const POLYInfo_t*>(pModel), dfX, dfY, pdfPixel, pdfLine);
            return 1;
        default:
            break;
    }
    if (IsModelObjectCode(nModelCode)) {
        return AsModelObject(pModel)->GroundToImage(dfX, dfY, dfZ, *pdfPixel, *pdfLine, false) == 0
                   ? 1
                   : 0;
    }
    // Families that have not joined the dispatch yet, code 8 and code 9.
    return 0;
}

int GenImg2GeoDem(int nModelCode, void* pModel, double dfPixel, double dfLine, double* pdfZ,
                  double* pdfX, double* pdfY) {
    if (!IsKnownCode(nModelCode)) return 0;
    if (!HasRecordAndOutputs(pModel, pdfX, pdfY) || pdfZ == nullptr) return 0;
    switch (nModelCode) {
        case LUMO_CODE_POLY:
            POLYImg2Geo(static_cast<const POLYInfo_t*>(pModel), dfPixel, dfLine, pdfX, pdfY);
            return 1;
        default:
            break;
    }
    if (nModelCode == LUMO_CODE_OBJECT_IMAGE_TO_GROUND || IsModelObjectCode(nModelCode)) {
        // A model object needs a real height: there is no terrain to consult.
        if (*pdfZ == LUMO_NULL_VALUE) return 0;
        return AsModelObject(pModel)->ImageToGround(dfPixel, dfLine, *pdfZ, *pdfX, *pdfY, false) ==
                       0
                   ? 1
                   : 0;
    }
    return 0;
}

int GenImg2Geo(int nModelCode, void* pModel, double dfPixel, double dfLine, double dfZ,
               double* pdfX, double* pdfY) {
    double dfHeight = dfZ;  // whatever the family writes back is discarded
    return GenImg2GeoDem(nModelCode, pModel, dfPixel, dfLine, &dfHeight, pdfX, pdfY);
}

namespace nova {
namespace mathmodel {

LumoModelType ModelCodeToLumoType(int nModelCode) {
    switch (nModelCode) {
        case 1: return LUMO_MODEL_AP;
        case 2: return LUMO_MODEL_SRIT;
        case 3: return LUMO_MODEL_LRS;
        case 4: return LUMO_MODEL_POLY;
        case 5: return LUMO_MODEL_TPS;
        case 6: return LUMO_MODEL_RF;
        case 7: return LUMO_MODEL_RTCS;
        case 10: return LUMO_MODEL_CODE10;
        case 11: return LUMO_MODEL_CODE11;
        case 12: return LUMO_MODEL_CODE12;
        default: return static_cast<LumoModelType>(-1);
    }
}

}  // namespace mathmodel
}  // namespace nova
