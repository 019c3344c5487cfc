// What the rational function transforms share, point by point and in
// batches: the record checks, the longitude wrap, the image conventions, the
// inverse's stop rule and its first guess.
#pragma once

#include <algorithm>
#include <cmath>

#include "lumo_rf.h"
#include "projection.h"

namespace lumo {
namespace rf {

constexpr int kMaxNewtonSteps = 20;
constexpr double kStepTolerance = 1e-5;     // normalised units
constexpr double kSingularJacobian = 1e-5;  // |det| below this stops the iteration
// The inverse also stops as soon as the functions map its estimate within
// this many pixels of the point asked for: a further step changes nothing
// that matters.
constexpr double kResidualPixels = 1e-9;
// A first guess farther than this from the cube's centre (normalised units)
// is not trusted; the iteration then starts at the centre.
constexpr double kMaxStartDistance = 10.0;

// Only 20 terms exist: a larger count evaluates those, a negative one none.
inline int UsableTerms(const RFInfo_t* psRF) {
    return std::clamp(psRF->nTerms, 0, RF_MAX_TERMS);
}

inline bool IsUsableScale(double dfScale) {
    return std::isfinite(dfScale) && dfScale != 0.0;
}

// A record whose arrays exist and whose normalisation is finite with
// non-zero scales; anything else would give NaN or infinity silently.
inline bool IsEvaluable(const RFInfo_t* psRF) {
    return psRF != nullptr && psRF->padfPixelNum != nullptr && psRF->padfPixelDen != nullptr &&
           psRF->padfLineNum != nullptr && psRF->padfLineDen != nullptr &&
           IsUsableScale(psRF->dfXScale) && IsUsableScale(psRF->dfYScale) &&
           IsUsableScale(psRF->dfZScale) && IsUsableScale(psRF->dfPixelScale) &&
           IsUsableScale(psRF->dfLineScale) && std::isfinite(psRF->dfXOffset) &&
           std::isfinite(psRF->dfYOffset) && std::isfinite(psRF->dfZOffset) &&
           std::isfinite(psRF->dfPixelOffset) && std::isfinite(psRF->dfLineOffset);
}

// Names, as a warning, the first field that makes a record unusable.
void ReportUnusableRecord(const RFInfo_t* psRF);

// Longitude wrap for models near the antimeridian: a model centred east of
// 90 degrees sees negative longitudes as beyond 180, and the converse.
inline double WrapLongitude(double dfX, double dfXOffset) {
    if (std::fabs(dfXOffset) > 90.0) {
        if (dfXOffset > 0.0 && dfX < 0.0) return dfX + 360.0;
        if (dfXOffset < 0.0 && dfX > 0.0) return dfX - 360.0;
    }
    return dfX;
}

inline bool IsGeographic(const RFInfo_t* psRF) {
    return psRF->psProjInfo != nullptr && psRF->psProjInfo->nProjKind == NOVA_PROJ_GEOGRAPHIC;
}

// A ground position an inverse may give: for geographic models a latitude
// within +-90 degrees and a longitude within half a turn of the model's.
inline bool IsPlaceOnEarth(const RFInfo_t* psRF, double dfX, double dfY) {
    if (!std::isfinite(dfX) || !std::isfinite(dfY)) return false;
    if (!IsGeographic(psRF)) return true;
    return std::fabs(dfY) <= 90.0 && std::fabs(dfX - psRF->dfXOffset) <= 180.0;
}

// Adjustment polynomial a0 + a1 p + a2 l + a3 p l + a4 p^2 + a5 l^2.
inline double Adjustment(const double* a, double p, double l) {
    return a[0] + a[1] * p + a[2] * l + a[3] * p * l + a[4] * p * p + a[5] * l * l;
}

// The image position a caller sees, from the functions' own (p, l): the
// image-space adjustment when the record has one, else the half-pixel shift
// when set.
inline void ToCallerImage(const RFInfo_t* psRF, double p, double l, double* pdfPixel,
                          double* pdfLine) {
    if (psRF->nAdjust) {
        *pdfPixel = p + Adjustment(psRF->adfPixelAdjust, p, l);
        *pdfLine = l + Adjustment(psRF->adfLineAdjust, p, l);
    } else if (psRF->nHalfPixelShift) {
        *pdfPixel = p + 0.5;
        *pdfLine = l + 0.5;
    } else {
        *pdfPixel = p;
        *pdfLine = l;
    }
}

// The converse: the functions' own (p, l) of a caller's image position.
inline void FromCallerImage(const RFInfo_t* psRF, double dfPixel, double dfLine, double* pdfP,
                            double* pdfL) {
    if (psRF->nAdjust) {
        *pdfP = dfPixel - Adjustment(psRF->adfPixelAdjust, dfPixel, dfLine);
        *pdfL = dfLine - Adjustment(psRF->adfLineAdjust, dfPixel, dfLine);
    } else if (psRF->nHalfPixelShift) {
        *pdfP = dfPixel - 0.5;
        *pdfL = dfLine - 0.5;
    } else {
        *pdfP = dfPixel;
        *pdfL = dfLine;
    }
}

// Starting point of the inverse at the normalised image position (pn, ln)
// and height w; false (outputs untouched) when none can be trusted.
bool FirstOrderStart(const RFInfo_t* psRF, double pn, double ln, double w, double* pdfU,
                     double* pdfV);

}  // namespace rf
}  // namespace lumo
