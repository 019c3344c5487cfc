// Outputs a transform cannot compute hold LUMO_NULL_VALUE.
#pragma once

#include "lumo_types.h"

namespace lumo {

// Sets both outputs that are given to LUMO_NULL_VALUE.
inline void SetNullPair(double* pdfA, double* pdfB) {
    if (pdfA != nullptr) *pdfA = LUMO_NULL_VALUE;
    if (pdfB != nullptr) *pdfB = LUMO_NULL_VALUE;
}

}  // namespace lumo
