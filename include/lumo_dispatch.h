// Generic dispatch of point transforms by model code.
#pragma once

#include "lumo_types.h"

// Ground to image. 1 when the transform was carried out, 0 otherwise. The
// three functions return 0 also when the family gives no position: an
// output that is the null value -1e20 or not finite (the outputs then hold
// what the family wrote).
LUMO_API int GenGeo2Img(int nModelCode, void* pModel, double dfX, double dfY, double dfZ,
                        double* pdfPixel, double* pdfLine);
// Image to ground at the height dfZ.
LUMO_API int GenImg2Geo(int nModelCode, void* pModel, double dfPixel, double dfLine, double dfZ,
                        double* pdfX, double* pdfY);
// Image to ground; *pdfZ carries the height in and a family may write it back.
LUMO_API int GenImg2GeoDem(int nModelCode, void* pModel, double dfPixel, double dfLine,
                           double* pdfZ, double* pdfX, double* pdfY);

namespace nova {
namespace mathmodel {

// Family enumeration of the math model object. The underlying type is fixed
// so that LUMO_MODEL_NONE (-1, a code without a family) is a value of it.
enum LumoModelType : int {
    LUMO_MODEL_NONE = -1,
    LUMO_MODEL_AP = 0,
    LUMO_MODEL_SRIT = 1,
    LUMO_MODEL_POLY = 2,
    LUMO_MODEL_TPS = 3,
    LUMO_MODEL_RF = 4,
    LUMO_MODEL_CODE11 = 5,
    LUMO_MODEL_RTCS = 6,
    LUMO_MODEL_LRS = 7,
    LUMO_MODEL_CODE10 = 8,
    LUMO_MODEL_CODE12 = 9,
};

// The enumeration value of a model code; LUMO_MODEL_NONE for codes without one.
LUMO_API LumoModelType ModelCodeToLumoType(int nModelCode);

}  // namespace mathmodel
}  // namespace nova
