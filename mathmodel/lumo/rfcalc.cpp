// Rational function model: allocation, release, ground to image and the
// Newton inverse.
#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "errors.h"
#include "inverse_check.h"
#include "lumo_rf.h"
#include "null_value.h"
#include "projection.h"
#include "record_check.h"
#include "rf_common.h"
#include "rpc_terms.h"
#include "runtime.h"

using lumo::rf::FromCallerImage;
using lumo::rf::IsEvaluable;
using lumo::rf::IsGeographic;
using lumo::rf::IsPlaceOnEarth;
using lumo::rf::kMaxNewtonSteps;
using lumo::rf::kResidualPixels;
using lumo::rf::kSingularJacobian;
using lumo::rf::kStepTolerance;
using lumo::rf::ReportUnusableRecord;
using lumo::rf::ToCallerImage;
using lumo::rf::UsableTerms;
using lumo::rf::WrapLongitude;

namespace {

constexpr const char* kDefaultGeosys = "LON D0";
// The forward transform is the hot loop of orthorectification, the inverse
// that of georeferencing: on x86-64 Linux both are also built for AVX2/FMA
// processors and picked at load time.
#if defined(__x86_64__) && defined(__linux__) && defined(__GNUC__) && !defined(__clang__)
#define LUMO_HOT_CLONES __attribute__((flatten, target_clones("arch=x86-64-v3", "default")))
#else
#define LUMO_HOT_CLONES
#endif

// Values of the 20 terms, or their derivatives.
struct TermSet {
    double t[RF_MAX_TERMS];
};

// Sum of c[i] * t[i] over the terms in use. The full model is the common
// case; its fixed length lets the compiler unroll and vectorise the sum.
// Four interleaved partial sums keep the chains of dependent additions short.
inline double Sum(const double* c, const double* t, int nTerms) {
    if (nTerms == RF_MAX_TERMS) {
        double a0 = 0.0, a1 = 0.0, a2 = 0.0, a3 = 0.0;
        for (int i = 0; i < RF_MAX_TERMS; i += 4) {
            a0 += c[i] * t[i];
            a1 += c[i + 1] * t[i + 1];
            a2 += c[i + 2] * t[i + 2];
            a3 += c[i + 3] * t[i + 3];
        }
        return (a0 + a1) + (a2 + a3);
    }
    double dfSum = 0.0;
    for (int i = 0; i < nTerms; ++i) dfSum += c[i] * t[i];
    return dfSum;
}

// Derivatives of a full 20-term polynomial by U and by V, formed from the
// ten terms of each that are not identically zero.
inline double DerivativeU(const double* c, double u, double v, double w) {
    return (c[1] + c[4] * v + c[5] * w + 2.0 * c[7] * u + c[10] * v * w) +
           (3.0 * c[11] * u * u + c[12] * v * v + c[13] * w * w + 2.0 * c[14] * u * v +
            2.0 * c[17] * u * w);
}

inline double DerivativeV(const double* c, double u, double v, double w) {
    return (c[2] + c[4] * u + c[6] * w + 2.0 * c[8] * v + c[10] * u * w) +
           (2.0 * c[12] * u * v + c[14] * u * u + 3.0 * c[15] * v * v + c[16] * w * w +
            2.0 * c[18] * v * w);
}

// The four sums at normalised (u, v, w).
struct Ratios {
    double dfPixelNum, dfPixelDen, dfLineNum, dfLineDen;
};

inline Ratios EvaluateSums(const RFInfo_t* psRF, const double* t) {
    const int n = UsableTerms(psRF);
    return {Sum(psRF->padfPixelNum, t, n), Sum(psRF->padfPixelDen, t, n),
            Sum(psRF->padfLineNum, t, n), Sum(psRF->padfLineDen, t, n)};
}

// Image position the rational functions give, before the adjustment or the
// half-pixel shift. False where a denominator vanishes (a pole of the model:
// no image position there) or the result is not finite.
inline bool RationalImage(const RFInfo_t* psRF, double u, double v, double w, double* pdfPixel,
                          double* pdfLine) {
    TermSet sTerms;
    nova::RpcTermValues(u, v, w, sTerms.t);
    const Ratios r = EvaluateSums(psRF, sTerms.t);
    if (r.dfPixelDen == 0.0 || r.dfLineDen == 0.0) return false;
    *pdfPixel = r.dfPixelNum / r.dfPixelDen * psRF->dfPixelScale + psRF->dfPixelOffset;
    *pdfLine = r.dfLineNum / r.dfLineDen * psRF->dfLineScale + psRF->dfLineOffset;
    return std::isfinite(*pdfPixel) && std::isfinite(*pdfLine);
}

// The failure values of the inverse: both ground coordinates the null value.
int NoGroundPoint(double* pdfX, double* pdfY) {
    lumo::SetNullPair(pdfX, pdfY);
    return 0;
}

// Places a new record's contents into the caller's record, or hands the new
// record over.
RFInfo_t* PlaceRecord(RFInfo_t* psNew, RFInfo_t* psExisting) {
    if (psExisting == nullptr) return psNew;
    *psExisting = *psNew;
    std::free(psNew);
    return psExisting;
}

// Normalises the default georeferencing text; the normalised form may be
// longer than the buffer, so it is cut to fit.
void SetDefaultGeosys(RFInfo_t* psRF) {
    char szNormalised[NOVA_GEOSYS_LEN] = {};
    DecodeGeosys(kDefaultGeosys, szNormalised);
    const std::size_t nCopy = strnlen(szNormalised, RF_TEXT_SIZE - 1);
    std::memcpy(psRF->pszGeosys, szNormalised, nCopy);
    psRF->pszGeosys[nCopy] = '\0';
    Geosys2ProjInfo(psRF->psProjInfo, psRF->pszGeosys, 0.0, 0.0, 1.0, 1.0);
}

}  // namespace

void lumo::rf::ReportUnusableRecord(const RFInfo_t* psRF) {
    if (psRF == nullptr || psRF->padfPixelNum == nullptr || psRF->padfPixelDen == nullptr ||
        psRF->padfLineNum == nullptr || psRF->padfLineDen == nullptr) {
        lumo::Warn(lumo::Err::kBadArgument,
                   _("Rational function model or its coefficient arrays are null."));
        return;
    }
    const struct {
        const char* pszName;
        double dfValue;
        bool bScale;
    } asFields[] = {
        {"RFInfo_t.dfXScale", psRF->dfXScale, true},
        {"RFInfo_t.dfYScale", psRF->dfYScale, true},
        {"RFInfo_t.dfZScale", psRF->dfZScale, true},
        {"RFInfo_t.dfPixelScale", psRF->dfPixelScale, true},
        {"RFInfo_t.dfLineScale", psRF->dfLineScale, true},
        {"RFInfo_t.dfXOffset", psRF->dfXOffset, false},
        {"RFInfo_t.dfYOffset", psRF->dfYOffset, false},
        {"RFInfo_t.dfZOffset", psRF->dfZOffset, false},
        {"RFInfo_t.dfPixelOffset", psRF->dfPixelOffset, false},
        {"RFInfo_t.dfLineOffset", psRF->dfLineOffset, false},
    };
    for (const auto& f : asFields) {
        const bool bBad = f.bScale ? !IsUsableScale(f.dfValue) : !std::isfinite(f.dfValue);
        if (bBad) {
            lumo::WarnReal(lumo::Err::kBadArgument, f.pszName, f.dfValue, 0);
            return;
        }
    }
}

RFInfo_t* RFAllocate(RFInfo_t* psExisting, int nTerms) {
    // Every piece is owned by the unique_ptr until the record is complete, so
    // an allocation failure part way releases what was already taken.
    std::unique_ptr<RFInfo_t, void (*)(RFInfo_t*)> psNew(
        static_cast<RFInfo_t*>(HCalloc(1, sizeof(RFInfo_t))), &RFDeallocate);
    psNew->nTerms = nTerms;
    psNew->nHalfPixelShift = 1;
    psNew->nDownsample = 1;
    psNew->nAdjust = 0;
    const std::uint64_t nCoeffs = static_cast<std::uint64_t>(std::max(nTerms, RF_MAX_TERMS));
    psNew->padfPixelNum = static_cast<double*>(HCalloc(nCoeffs, sizeof(double)));
    psNew->padfPixelDen = static_cast<double*>(HCalloc(nCoeffs, sizeof(double)));
    psNew->padfLineNum = static_cast<double*>(HCalloc(nCoeffs, sizeof(double)));
    psNew->padfLineDen = static_cast<double*>(HCalloc(nCoeffs, sizeof(double)));
    psNew->pszSensor = static_cast<char*>(HMalloc(RF_TEXT_SIZE));
    psNew->pszSensor[0] = '\0';
    psNew->pszGeosys = static_cast<char*>(HMalloc(RF_TEXT_SIZE));
    psNew->pszGeosys[0] = '\0';
    psNew->psProjInfo = static_cast<ProjInfo_t*>(HCalloc(1, sizeof(ProjInfo_t)));
    InitProjInfo(psNew->psProjInfo, 0);
    std::fill(std::begin(psNew->adfPixelAdjust), std::end(psNew->adfPixelAdjust), 0.0);
    std::fill(std::begin(psNew->adfLineAdjust), std::end(psNew->adfLineAdjust), 0.0);
    SetDefaultGeosys(psNew.get());
    return PlaceRecord(psNew.release(), psExisting);
}

void RFDeallocate(RFInfo_t* psRF) {
    if (psRF == nullptr) return;
    std::free(psRF->psProjInfo);
    std::free(psRF->pszSensor);
    std::free(psRF->pszGeosys);
    std::free(psRF->padfLineDen);
    std::free(psRF->padfLineNum);
    std::free(psRF->padfPixelDen);
    std::free(psRF->padfPixelNum);
    std::free(psRF);
}

LUMO_HOT_CLONES
void RFGeo2Img(RFInfo_t* psRF, double dfX, double dfY, double dfZ, double* pdfPixel,
               double* pdfLine) {
    if (pdfPixel == nullptr || pdfLine == nullptr) {
        lumo::Warn(lumo::Err::kBadArgument, _("Rational function output pointer is null."));
        return;
    }
    if (!IsEvaluable(psRF)) {
        ReportUnusableRecord(psRF);
        *pdfPixel = LUMO_NULL_VALUE;
        *pdfLine = LUMO_NULL_VALUE;
        return;
    }
    if (dfZ == LUMO_NULL_VALUE) dfZ = 0.0;
    dfX = WrapLongitude(dfX, psRF->dfXOffset);
    const double u = (dfX - psRF->dfXOffset) / psRF->dfXScale;
    const double v = (dfY - psRF->dfYOffset) / psRF->dfYScale;
    const double w = (dfZ - psRF->dfZOffset) / psRF->dfZScale;
    double p = 0.0;
    double l = 0.0;
    if (!RationalImage(psRF, u, v, w, &p, &l)) {
        *pdfPixel = LUMO_NULL_VALUE;
        *pdfLine = LUMO_NULL_VALUE;
        return;
    }
    ToCallerImage(psRF, p, l, pdfPixel, pdfLine);
}

namespace {

// Partial derivatives of the normalised pixel and line by u and v.
struct Jacobian {
    double pu, pv, lu, lv;
};

Jacobian JacobianAt(const RFInfo_t* psRF, const Ratios& r, double dfU, double dfV, double dfW) {
    Ratios ru, rv;
    if (UsableTerms(psRF) == RF_MAX_TERMS) {
        ru = {DerivativeU(psRF->padfPixelNum, dfU, dfV, dfW),
              DerivativeU(psRF->padfPixelDen, dfU, dfV, dfW),
              DerivativeU(psRF->padfLineNum, dfU, dfV, dfW),
              DerivativeU(psRF->padfLineDen, dfU, dfV, dfW)};
        rv = {DerivativeV(psRF->padfPixelNum, dfU, dfV, dfW),
              DerivativeV(psRF->padfPixelDen, dfU, dfV, dfW),
              DerivativeV(psRF->padfLineNum, dfU, dfV, dfW),
              DerivativeV(psRF->padfLineDen, dfU, dfV, dfW)};
    } else {
        // Fewer terms: the derivatives take the same terms as the values.
        TermSet sDu, sDv;
        nova::RpcTermDerivatives(dfU, dfV, dfW, sDu.t, sDv.t);
        ru = EvaluateSums(psRF, sDu.t);
        rv = EvaluateSums(psRF, sDv.t);
    }
    const double dp2 = r.dfPixelDen * r.dfPixelDen;
    const double dl2 = r.dfLineDen * r.dfLineDen;
    return {(ru.dfPixelNum * r.dfPixelDen - r.dfPixelNum * ru.dfPixelDen) / dp2,
            (rv.dfPixelNum * r.dfPixelDen - r.dfPixelNum * rv.dfPixelDen) / dp2,
            (ru.dfLineNum * r.dfLineDen - r.dfLineNum * ru.dfLineDen) / dl2,
            (rv.dfLineNum * r.dfLineDen - r.dfLineNum * rv.dfLineDen) / dl2};
}

// What the inverse carries from step to step: the Jacobian of its last full
// step, reused (a chord step, which needs the values only) near the answer,
// where the steps are short and the residual keeps falling at least tenfold
// per step; and the residual target, in normalised image units.
struct InverseState {
    bool bHaveJacobian = false;
    Jacobian sJacobian{};
    double dfLastResidual = HUGE_VAL;
    double dfLastStep = HUGE_VAL;
    double dfPixelLimit = -1.0;  // negative: never converged, every step full
    double dfLineLimit = -1.0;
};
constexpr double kChordRatio = 0.1;
constexpr double kChordStep = 1e-2;  // normalised units

struct NewtonOutcome {
    bool bConverged = false;  // (u, v) maps within the limits: no step made
    bool bStep = false;       // a step was made: (dfU, dfV) holds it
    bool bChord = false;      // with an earlier step's Jacobian
    double dfU = 0.0;
    double dfV = 0.0;
};

// One step from (u, v) towards the normalised image point (pn, ln) at the
// height w. No step is made when the functions map (u, v) within the
// state's limits, cannot be evaluated there or the Jacobian is singular.
NewtonOutcome NewtonStep(const RFInfo_t* psRF, double pn, double ln, double dfU, double dfV,
                         double dfW, InverseState& state) {
    NewtonOutcome s;
    TermSet sT;
    nova::RpcTermValues(dfU, dfV, dfW, sT.t);
    const Ratios r = EvaluateSums(psRF, sT.t);
    // A vanishing denominator has no ratio and no derivative: no step.
    if (r.dfPixelDen == 0.0 || r.dfLineDen == 0.0) return s;
    const double fp = r.dfPixelNum / r.dfPixelDen - pn;
    const double fl = r.dfLineNum / r.dfLineDen - ln;
    if (std::fabs(fp) <= state.dfPixelLimit && std::fabs(fl) <= state.dfLineLimit) {
        s.bConverged = true;
        return s;
    }
    const double dfResidual = std::max(std::fabs(fp), std::fabs(fl));
    s.bChord = state.bHaveJacobian && state.dfLastStep <= kChordStep &&
               dfResidual <= kChordRatio * state.dfLastResidual;
    if (!s.bChord) {
        state.sJacobian = JacobianAt(psRF, r, dfU, dfV, dfW);
        state.bHaveJacobian = state.dfPixelLimit >= 0.0;  // only the inverse reuses it
    }
    state.dfLastResidual = dfResidual;
    const Jacobian& j = state.sJacobian;
    const double det = j.pu * j.lv - j.pv * j.lu;
    if (!(std::fabs(det) >= kSingularJacobian)) return s;  // also refuses NaN
    const double u = dfU - (j.lv * fp - j.pv * fl) / det;
    const double v = dfV - (j.pu * fl - j.lu * fp) / det;
    if (!std::isfinite(u) || !std::isfinite(v)) return s;
    state.dfLastStep = std::max(std::fabs(u - dfU), std::fabs(v - dfV));
    s.bStep = true;
    s.dfU = u;
    s.dfV = v;
    return s;
}

}  // namespace

// Starting point of the inverse: the exact inverse of the functions' first
// order part at the height w, where pN (D0 + D1 u + D2 v + D3 w) =
// N0 + N1 u + N2 v + N3 w is linear in (u, v). Real models are nearly that,
// so Newton starts close and needs a step or two. False when that part is
// singular or its answer implausible.
bool lumo::rf::FirstOrderStart(const RFInfo_t* psRF, double pn, double ln, double w, double* pdfU,
                               double* pdfV) {
    const int n = UsableTerms(psRF);
    auto c = [n](const double* a, int i) { return i < n ? a[i] : 0.0; };
    auto row = [&](const double* num, const double* den, double target, double* a) {
        a[0] = c(num, 1) - target * c(den, 1);
        a[1] = c(num, 2) - target * c(den, 2);
        a[2] = target * (c(den, 0) + c(den, 3) * w) - c(num, 0) - c(num, 3) * w;
    };
    double p[3], l[3];
    row(psRF->padfPixelNum, psRF->padfPixelDen, pn, p);
    row(psRF->padfLineNum, psRF->padfLineDen, ln, l);
    const double det = p[0] * l[1] - p[1] * l[0];
    if (!(std::fabs(det) >= kSingularJacobian)) return false;
    const double u = (p[2] * l[1] - p[1] * l[2]) / det;
    const double v = (p[0] * l[2] - p[2] * l[0]) / det;
    if (!(std::fabs(u) <= kMaxStartDistance && std::fabs(v) <= kMaxStartDistance)) return false;
    *pdfU = u;
    *pdfV = v;
    return true;
}

int Newton(RFInfo_t* psRF, double dfPixelN, double dfLineN, double dfU, double dfV, double dfW,
           double* pdfU, double* pdfV) {
    if (psRF == nullptr || pdfU == nullptr || pdfV == nullptr || !IsEvaluable(psRF)) return 0;
    InverseState state;  // a full step, whatever the residual
    const NewtonOutcome s = NewtonStep(psRF, dfPixelN, dfLineN, dfU, dfV, dfW, state);
    if (!s.bStep) return 0;
    *pdfU = s.dfU;
    *pdfV = s.dfV;
    return 1;
}

LUMO_HOT_CLONES
int RFImg2Geo(RFInfo_t* psRF, double dfPixel, double dfLine, double* pdfX, double* pdfY,
              double* pdfZ) {
    if (pdfX == nullptr || pdfY == nullptr || pdfZ == nullptr) {
        lumo::Warn(lumo::Err::kBadArgument, _("Rational function output pointer is null."));
        return 0;
    }
    if (!IsEvaluable(psRF)) {
        ReportUnusableRecord(psRF);
        return NoGroundPoint(pdfX, pdfY);
    }
    if (!std::isfinite(dfPixel) || !std::isfinite(dfLine)) {
        lumo::WarnReal(lumo::Err::kBadArgument, std::isfinite(dfPixel) ? "line" : "pixel",
                       std::isfinite(dfPixel) ? dfLine : dfPixel, 0);
        return NoGroundPoint(pdfX, pdfY);
    }
    const double dfHeight = *pdfZ == LUMO_NULL_VALUE ? psRF->dfZOffset : *pdfZ;
    const bool bNoGuessX = *pdfX == 0.0 || *pdfX == LUMO_NULL_VALUE;
    const bool bNoGuessY = *pdfY == 0.0 || *pdfY == LUMO_NULL_VALUE;
    const bool bNoGuess = bNoGuessX && bNoGuessY;  // then the first-order start is used
    const double dfStartX = bNoGuessX ? psRF->dfXOffset : *pdfX;
    const double dfStartY = bNoGuessY ? psRF->dfYOffset : *pdfY;
    if (!std::isfinite(dfHeight) || !std::isfinite(dfStartX) || !std::isfinite(dfStartY)) {
        lumo::WarnReal(
            lumo::Err::kBadArgument,
            !std::isfinite(dfHeight) ? "height" : "starting ground coordinate",
            !std::isfinite(dfHeight) ? dfHeight : (std::isfinite(dfStartX) ? dfStartY : dfStartX),
            0);
        return NoGroundPoint(pdfX, pdfY);
    }

    // Remove the image-space adjustment or the half-pixel shift.
    double p = dfPixel;
    double l = dfLine;
    FromCallerImage(psRF, dfPixel, dfLine, &p, &l);
    const double pn = (p - psRF->dfPixelOffset) / psRF->dfPixelScale;
    const double ln = (l - psRF->dfLineOffset) / psRF->dfLineScale;

    double u = (dfStartX - psRF->dfXOffset) / psRF->dfXScale;
    double v = (dfStartY - psRF->dfYOffset) / psRF->dfYScale;
    const double w = (dfHeight - psRF->dfZOffset) / psRF->dfZScale;
    if (bNoGuess) lumo::rf::FirstOrderStart(psRF, pn, ln, w, &u, &v);
    InverseState state;
    state.dfPixelLimit = kResidualPixels / std::fabs(psRF->dfPixelScale);
    state.dfLineLimit = kResidualPixels / std::fabs(psRF->dfLineScale);
    bool bConverged = false;
    for (int nSteps = 1; nSteps <= kMaxNewtonSteps; ++nSteps) {
        const NewtonOutcome s = NewtonStep(psRF, pn, ln, u, v, w, state);
        bConverged = s.bConverged;
        if (!s.bStep) break;
        // A small full step ends the iteration; after a chord step, whose
        // convergence is only linear, the residual decides.
        const bool bSmallStep = !s.bChord && std::fabs(s.dfU - u) < kStepTolerance &&
                                std::fabs(s.dfV - v) < kStepTolerance;
        u = s.dfU;
        v = s.dfV;
        if (bSmallStep) break;
    }

    *pdfZ = dfHeight;
    // The iteration may stop on its step limit, on a singular step, or on a
    // small step far from any solution: its answer counts only when the
    // rational functions map it back onto the image point asked for (which
    // the last step has just found when it converged), and it is a place on
    // the Earth.
    double pBack = p;
    double lBack = l;
    const double dfX = WrapLongitude(u * psRF->dfXScale + psRF->dfXOffset, psRF->dfXOffset);
    const double dfY = v * psRF->dfYScale + psRF->dfYOffset;
    if ((!bConverged && !RationalImage(psRF, u, v, w, &pBack, &lBack)) ||
        !lumo::WithinInverseTolerance(pBack - p, lBack - l) || !IsPlaceOnEarth(psRF, dfX, dfY)) {
        return NoGroundPoint(pdfX, pdfY);
    }
    *pdfX = dfX;
    *pdfY = dfY;
    return 1;
}

// ---------------------------------------------------------------------------
// Validation
// ---------------------------------------------------------------------------

namespace {

// Bounds of the normalisation: what a real image and a real place can have.
constexpr double kMaxImageExtent = 1e9;   // pixels and lines
constexpr double kMaxGroundExtent = 1e9;  // projected ground units
constexpr double kMaxHeightExtent = 1e5;  // metres
// Largest normalised image value the functions may give inside their own
// ground cube, where real models stay within about +-1.
constexpr double kMaxNormalisedImage = 1e3;

// An offset within +-dfOffsetLimit and a non-zero scale within +-dfScaleLimit.
std::string CheckNormalisation(const char* pszOffset, double dfOffset, const char* pszScale,
                               double dfScale, double dfOffsetLimit, double dfScaleLimit,
                               const char* pszDomain) {
    if (!(std::fabs(dfOffset) <= dfOffsetLimit)) {
        return lumo::FieldProblem(
            pszOffset, dfOffset,
            nova::FormatString("an offset must be finite and lie within +-%g (%s)", dfOffsetLimit,
                               pszDomain));
    }
    if (dfScale == 0.0 || !(std::fabs(dfScale) <= dfScaleLimit)) {
        return lumo::FieldProblem(
            pszScale, dfScale,
            nova::FormatString("a scale must be non-zero and lie within +-%g (%s)", dfScaleLimit,
                               pszDomain));
    }
    return "";
}

std::string CheckNormalisations(const RFInfo_t& rf) {
    const bool bGeographic = IsGeographic(&rf);
    const struct {
        const char *pszOffset, *pszScale;
        double dfOffset, dfScale, dfOffsetLimit, dfScaleLimit;
        const char* pszDomain;
    } asChecks[] = {
        {"dfXOffset", "dfXScale", rf.dfXOffset, rf.dfXScale, bGeographic ? 360.0 : kMaxGroundExtent,
         bGeographic ? 180.0 : kMaxGroundExtent,
         bGeographic ? "degrees of longitude" : "ground units"},
        {"dfYOffset", "dfYScale", rf.dfYOffset, rf.dfYScale, bGeographic ? 90.0 : kMaxGroundExtent,
         bGeographic ? 90.0 : kMaxGroundExtent,
         bGeographic ? "degrees of latitude" : "ground units"},
        {"dfZOffset", "dfZScale", rf.dfZOffset, rf.dfZScale, kMaxHeightExtent, kMaxHeightExtent,
         "metres of height"},
        {"dfPixelOffset", "dfPixelScale", rf.dfPixelOffset, rf.dfPixelScale, kMaxImageExtent,
         kMaxImageExtent, "pixels"},
        {"dfLineOffset", "dfLineScale", rf.dfLineOffset, rf.dfLineScale, kMaxImageExtent,
         kMaxImageExtent, "lines"},
    };
    for (const auto& c : asChecks) {
        std::string problem = CheckNormalisation(c.pszOffset, c.dfOffset, c.pszScale, c.dfScale,
                                                 c.dfOffsetLimit, c.dfScaleLimit, c.pszDomain);
        if (!problem.empty()) return problem;
    }
    return "";
}

// The functions must be evaluable over their own ground cube: at its 27
// nodes (normalised -1, 0, 1 on each axis) both denominators are non-zero
// and keep one sign (a sign change puts a pole inside the model's domain),
// and the normalised image values stay bounded.
std::string CheckDomain(const RFInfo_t& rf) {
    const int nTerms = UsableTerms(&rf);
    if (std::all_of(rf.padfPixelDen, rf.padfPixelDen + nTerms, [](double c) { return c == 0.0; })) {
        return "padfPixelDen: every coefficient is 0, so the pixel denominator vanishes everywhere";
    }
    if (std::all_of(rf.padfLineDen, rf.padfLineDen + nTerms, [](double c) { return c == 0.0; })) {
        return "padfLineDen: every coefficient is 0, so the line denominator vanishes everywhere";
    }
    double dfPixelSign = 0.0, dfLineSign = 0.0;
    for (int k = 0; k < 27; ++k) {
        const int nU = k % 3, nV = (k / 3) % 3, nW = k / 9;  // node indices 0..2
        const double u = nU - 1.0, v = nV - 1.0, w = nW - 1.0;
        TermSet sTerms;
        nova::RpcTermValues(u, v, w, sTerms.t);
        const Ratios r = EvaluateSums(&rf, sTerms.t);
        const double p = r.dfPixelNum / r.dfPixelDen, l = r.dfLineNum / r.dfLineDen;
        if (dfPixelSign == 0.0) dfPixelSign = r.dfPixelDen;
        if (dfLineSign == 0.0) dfLineSign = r.dfLineDen;
        const bool bPoles =
            !(r.dfPixelDen * dfPixelSign > 0.0) || !(r.dfLineDen * dfLineSign > 0.0);
        if (bPoles || !(std::fabs(p) <= kMaxNormalisedImage) ||
            !(std::fabs(l) <= kMaxNormalisedImage)) {
            return nova::FormatString(
                "at the normalised ground point (%g, %g, %g) the functions give pixel %.6g / %.6g "
                "and line %.6g / %.6g: %s",
                u, v, w, r.dfPixelNum, r.dfPixelDen, r.dfLineNum, r.dfLineDen,
                bPoles ? "a denominator vanishes or changes sign inside the model's domain"
                       : "not a bounded image position");
        }
    }
    return "";
}

}  // namespace

std::string RFValidate(const RFInfo_t* psRF) {
    if (psRF == nullptr || psRF->padfPixelNum == nullptr || psRF->padfPixelDen == nullptr ||
        psRF->padfLineNum == nullptr || psRF->padfLineDen == nullptr) {
        return "the record or its coefficient arrays are null";
    }
    const RFInfo_t& rf = *psRF;
    if (rf.nTerms < 1 || rf.nTerms > RF_MAX_TERMS) {
        return lumo::FieldProblem("nTerms", rf.nTerms, "the model has 1 to 20 terms");
    }
    std::string problem = CheckNormalisations(rf);
    if (problem.empty()) problem = lumo::FirstNonFinite("padfPixelNum", rf.padfPixelNum, rf.nTerms);
    if (problem.empty()) problem = lumo::FirstNonFinite("padfPixelDen", rf.padfPixelDen, rf.nTerms);
    if (problem.empty()) problem = lumo::FirstNonFinite("padfLineNum", rf.padfLineNum, rf.nTerms);
    if (problem.empty()) problem = lumo::FirstNonFinite("padfLineDen", rf.padfLineDen, rf.nTerms);
    if (problem.empty() && rf.nAdjust) {
        problem = lumo::FirstNonFinite("adfPixelAdjust", rf.adfPixelAdjust, RF_ADJUST_TERMS);
        if (problem.empty()) {
            problem = lumo::FirstNonFinite("adfLineAdjust", rf.adfLineAdjust, RF_ADJUST_TERMS);
        }
    }
    if (problem.empty()) problem = CheckDomain(rf);
    return problem;
}
