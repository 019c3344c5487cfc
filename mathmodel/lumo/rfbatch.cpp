// Rational functions over many points at once. Points go through in groups
// of four held in vectors of the compiler's extension, so every sum serves
// the whole group with vector instructions (AVX2/FMA
// where the processor has them, chosen at load time); the inverse's
// derivative polynomials are formed once per call, and large batches are
// split across threads.
#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstddef>
#include <cstring>

#include "errors.h"
#include "inverse_check.h"
#include "lumo_rf.h"
#include "parallel.h"
#include "rf_common.h"
#include "rpc_terms.h"
#include "runtime.h"

namespace {

using nova::kRpcQuadraticTerms;
using nova::kRpcTermCount;

#if defined(__x86_64__) && defined(__linux__) && defined(__GNUC__) && !defined(__clang__)
#define LUMO_BATCH_CLONES __attribute__((flatten, target_clones("arch=x86-64-v3", "default")))
#else
#define LUMO_BATCH_CLONES
#endif

constexpr int kLanes = 4;
// Four points' values of one quantity, in the compiler's vector extension:
// one AVX register, or two SSE2 ones on the baseline.
using Vec = double __attribute__((vector_size(kLanes * sizeof(double))));

// Fewest points per thread: a forward point costs a few nanoseconds, an
// inverse one a few tens.
constexpr std::size_t kMinForwardPerThread = 32768;
constexpr std::size_t kMinInversePerThread = 4096;

// The four polynomials in this order.
enum Poly { kPixelNum, kPixelDen, kLineNum, kLineDen, kPolys };

// What every point of a call shares: the coefficients padded to 20 terms,
// and for the inverse the coefficients of their derivatives by u and v,
// each already spread over a vector's lanes.
struct SharedModel {
    Vec c[kPolys][kRpcTermCount] = {};
    Vec du[kPolys][kRpcQuadraticTerms] = {};
    Vec dv[kPolys][kRpcQuadraticTerms] = {};

    explicit SharedModel(const RFInfo_t* psRF) {
        const double* apadf[kPolys] = {psRF->padfPixelNum, psRF->padfPixelDen, psRF->padfLineNum,
                                       psRF->padfLineDen};
        const int nTerms = lumo::rf::UsableTerms(psRF);
        for (int f = 0; f < kPolys; ++f) {
            double adfC[kRpcTermCount] = {};
            double adfU[kRpcQuadraticTerms], adfV[kRpcQuadraticTerms];
            std::copy(apadf[f], apadf[f] + nTerms, adfC);
            nova::RpcDerivativeCoefficients(adfC, adfU, adfV);
            for (int i = 0; i < kRpcTermCount; ++i) c[f][i] = Vec{} + adfC[i];
            for (int i = 0; i < kRpcQuadraticTerms; ++i) {
                du[f][i] = Vec{} + adfU[i];
                dv[f][i] = Vec{} + adfV[i];
            }
        }
    }
};

// A group of points in normalised ground coordinates.
struct Group {
    Vec u{}, v{}, w{};
};

// The four sums of a group, and with derivatives those by u and v.
struct GroupSums {
    Vec s[kPolys];
    Vec su[kPolys];
    Vec sv[kPolys];
};

// Two interleaved partial sums halve the chain of dependent additions.
template <int N>
inline Vec Sum(const Vec* c, const Vec* t) {
    Vec acc0{}, acc1{};
    for (int i = 0; i < N; i += 2) {
        acc0 += c[i] * t[i];
        acc1 += c[i + 1] * t[i + 1];
    }
    return acc0 + acc1;
}

inline void EvaluateGroup(const SharedModel& m, const Group& g, bool bDerivatives, GroupSums& out) {
    Vec t[kRpcTermCount];
    nova::RpcTermValues(g.u, g.v, g.w, t);
    for (int f = 0; f < kPolys; ++f) {
        out.s[f] = Sum<kRpcTermCount>(m.c[f], t);
        if (!bDerivatives) continue;
        out.su[f] = Sum<kRpcQuadraticTerms>(m.du[f], t);
        out.sv[f] = Sum<kRpcQuadraticTerms>(m.dv[f], t);
    }
}

// Lanes [0, nUsed) of a group from arrays at i0; the others repeat the last.
inline Vec Load(const double* padf, std::size_t i0, int nUsed) {
    Vec x;
    if (nUsed == kLanes) {
        std::memcpy(&x, padf + i0, sizeof x);
        return x;
    }
    for (int k = 0; k < kLanes; ++k) x[k] = padf[i0 + std::min(k, nUsed - 1)];
    return x;
}

// Heights of a group: a null height takes dfNull, a missing array too.
inline Vec LoadHeights(const double* padfZ, std::size_t i0, int nUsed, double dfNull) {
    if (padfZ == nullptr) return Vec{} + dfNull;
    Vec z = Load(padfZ, i0, nUsed);
    for (int k = 0; k < kLanes; ++k)
        if (z[k] == LUMO_NULL_VALUE) z[k] = dfNull;
    return z;
}

// Normalised (u, v, w) of a group of ground points, with the longitude wrap
// of models near the antimeridian.
inline Group Normalise(const RFInfo_t* psRF, Vec x, Vec y, Vec z) {
    if (std::fabs(psRF->dfXOffset) > 90.0)
        for (int k = 0; k < kLanes; ++k) x[k] = lumo::rf::WrapLongitude(x[k], psRF->dfXOffset);
    Group g;
    g.u = (x - psRF->dfXOffset) / psRF->dfXScale;
    g.v = (y - psRF->dfYOffset) / psRF->dfYScale;
    g.w = (z - psRF->dfZOffset) / psRF->dfZScale;
    return g;
}

void SetResult(std::size_t i, bool bOk, double dfA, double dfB, double* padfA, double* padfB,
               int* panValid) {
    padfA[i] = bOk ? dfA : LUMO_NULL_VALUE;
    padfB[i] = bOk ? dfB : LUMO_NULL_VALUE;
    if (panValid != nullptr) panValid[i] = bOk ? 1 : 0;
}

// One call's arrays: inputs (X, Y or pixel, line) and heights, outputs.
struct BatchArgs {
    const RFInfo_t* psRF;
    const SharedModel* poModel;
    const double *padfIn1, *padfIn2, *padfZ;
    double *padfOut1, *padfOut2;
    int* panValid;
};

// Image positions of a group before the adjustment or half-pixel shift.
inline void ImageOf(const RFInfo_t* psRF, const GroupSums& r, Vec& p, Vec& l) {
    p = r.s[kPixelNum] / r.s[kPixelDen] * psRF->dfPixelScale + psRF->dfPixelOffset;
    l = r.s[kLineNum] / r.s[kLineDen] * psRF->dfLineScale + psRF->dfLineOffset;
}

// Points [nBegin, nEnd) ground to image, as RFGeo2Img does each; returns
// how many failed.
LUMO_BATCH_CLONES
std::size_t ForwardRange(const BatchArgs& a, std::size_t nBegin, std::size_t nEnd) {
    const RFInfo_t* psRF = a.psRF;
    std::size_t nFailed = 0;
    for (std::size_t i0 = nBegin; i0 < nEnd; i0 += kLanes) {
        const int nUsed = static_cast<int>(std::min<std::size_t>(kLanes, nEnd - i0));
        const Group g = Normalise(psRF, Load(a.padfIn1, i0, nUsed), Load(a.padfIn2, i0, nUsed),
                                  LoadHeights(a.padfZ, i0, nUsed, 0.0));
        GroupSums r;
        EvaluateGroup(*a.poModel, g, false, r);
        Vec p, l;
        ImageOf(psRF, r, p, l);
        // The half-pixel shift for the group at once; an adjustment point by
        // point.
        const double dfShift = psRF->nHalfPixelShift && !psRF->nAdjust ? 0.5 : 0.0;
        const Vec ps = p + dfShift, ls = l + dfShift;
        for (int k = 0; k < nUsed; ++k) {
            // A vanishing denominator is a pole: no image position there.
            const bool bOk = r.s[kPixelDen][k] != 0.0 && r.s[kLineDen][k] != 0.0 &&
                             std::isfinite(p[k]) && std::isfinite(l[k]);
            double dfPixel = ps[k], dfLine = ls[k];
            if (psRF->nAdjust) lumo::rf::ToCallerImage(psRF, p[k], l[k], &dfPixel, &dfLine);
            SetResult(i0 + k, bOk, dfPixel, dfLine, a.padfOut1, a.padfOut2, a.panValid);
            if (!bOk) ++nFailed;
        }
    }
    return nFailed;
}

// Where each lane of an inverse group stands.
struct InverseLanes {
    Group g;
    Vec pn{}, ln{};               // normalised targets
    Vec pr{}, lr{};               // targets before normalisation
    bool bActive[kLanes] = {};    // still iterating
    bool bInput[kLanes] = {};     // inputs usable
    bool bLastStep[kLanes] = {};  // the step after a small one ends the iteration
};

// One Newton step for every active lane of a group, with the stop rules of
// the point inverse: converged, pole, singular Jacobian, non-finite step.
// A small step is followed by one more unless the residual is already
// within the limits: with every step a full one, that last step takes the
// residual from the small step's square down to rounding.
void StepGroup(const GroupSums& r, double dfPixelLimit, double dfLineLimit, InverseLanes& s) {
    const Vec dp = r.s[kPixelDen], dl = r.s[kLineDen];
    const Vec np = r.s[kPixelNum], nl = r.s[kLineNum];
    const Vec fp = np / dp - s.pn;
    const Vec fl = nl / dl - s.ln;
    const Vec pu = (r.su[kPixelNum] * dp - np * r.su[kPixelDen]) / (dp * dp);
    const Vec pv = (r.sv[kPixelNum] * dp - np * r.sv[kPixelDen]) / (dp * dp);
    const Vec lu = (r.su[kLineNum] * dl - nl * r.su[kLineDen]) / (dl * dl);
    const Vec lv = (r.sv[kLineNum] * dl - nl * r.sv[kLineDen]) / (dl * dl);
    const Vec det = pu * lv - pv * lu;
    const Vec u = s.g.u - (lv * fp - pv * fl) / det;
    const Vec v = s.g.v - (pu * fl - lu * fp) / det;
    for (int k = 0; k < kLanes; ++k) {
        if (!s.bActive[k]) continue;
        s.bActive[k] = false;
        if (dp[k] == 0.0 || dl[k] == 0.0) continue;
        if (std::fabs(fp[k]) <= dfPixelLimit && std::fabs(fl[k]) <= dfLineLimit) continue;
        if (!(std::fabs(det[k]) >= lumo::rf::kSingularJacobian)) continue;
        if (!std::isfinite(u[k]) || !std::isfinite(v[k])) continue;
        s.bActive[k] = !s.bLastStep[k];
        s.bLastStep[k] = std::fabs(u[k] - s.g.u[k]) < lumo::rf::kStepTolerance &&
                         std::fabs(v[k] - s.g.v[k]) < lumo::rf::kStepTolerance;
        s.g.u[k] = u[k];
        s.g.v[k] = v[k];
    }
}

// Loads a group's targets and first guesses; a lane whose pixel, line or
// height is not finite stays inactive.
void StartGroup(const BatchArgs& a, std::size_t i0, int nUsed, InverseLanes& s) {
    const RFInfo_t* psRF = a.psRF;
    const Vec z = LoadHeights(a.padfZ, i0, nUsed, psRF->dfZOffset);
    for (int k = 0; k < nUsed; ++k) {
        const std::size_t i = i0 + k;
        s.bInput[k] =
            std::isfinite(a.padfIn1[i]) && std::isfinite(a.padfIn2[i]) && std::isfinite(z[k]);
        if (!s.bInput[k]) continue;
        double p = 0.0, l = 0.0;
        lumo::rf::FromCallerImage(psRF, a.padfIn1[i], a.padfIn2[i], &p, &l);
        s.pr[k] = p;
        s.lr[k] = l;
        s.bActive[k] = true;
    }
    s.pn = (s.pr - psRF->dfPixelOffset) / psRF->dfPixelScale;
    s.ln = (s.lr - psRF->dfLineOffset) / psRF->dfLineScale;
    s.g.w = (z - psRF->dfZOffset) / psRF->dfZScale;
    for (int k = 0; k < nUsed; ++k) {
        double u = 0.0, v = 0.0;
        if (s.bActive[k]) lumo::rf::FirstOrderStart(psRF, s.pn[k], s.ln[k], s.g.w[k], &u, &v);
        s.g.u[k] = u;
        s.g.v[k] = v;
    }
}

// Points [nBegin, nEnd) image to ground; returns how many failed.
LUMO_BATCH_CLONES
std::size_t InverseRange(const BatchArgs& a, std::size_t nBegin, std::size_t nEnd) {
    const RFInfo_t* psRF = a.psRF;
    const double dfPixelLimit = lumo::rf::kResidualPixels / std::fabs(psRF->dfPixelScale);
    const double dfLineLimit = lumo::rf::kResidualPixels / std::fabs(psRF->dfLineScale);
    std::size_t nFailed = 0;
    for (std::size_t i0 = nBegin; i0 < nEnd; i0 += kLanes) {
        const int nUsed = static_cast<int>(std::min<std::size_t>(kLanes, nEnd - i0));
        InverseLanes s;
        StartGroup(a, i0, nUsed, s);
        GroupSums r;
        for (int nStep = 0; nStep < lumo::rf::kMaxNewtonSteps; ++nStep) {
            if (std::none_of(s.bActive, s.bActive + kLanes, [](bool b) { return b; })) break;
            EvaluateGroup(*a.poModel, s.g, true, r);
            StepGroup(r, dfPixelLimit, dfLineLimit, s);
        }
        // Every answer is projected forward once more (all lanes at once)
        // and accepted within the inverse tolerance, on the Earth.
        EvaluateGroup(*a.poModel, s.g, false, r);
        Vec p, l;
        ImageOf(psRF, r, p, l);
        const Vec x = s.g.u * psRF->dfXScale + psRF->dfXOffset;
        const Vec y = s.g.v * psRF->dfYScale + psRF->dfYOffset;
        for (int k = 0; k < nUsed; ++k) {
            const double dfX = lumo::rf::WrapLongitude(x[k], psRF->dfXOffset);
            const bool bOk = s.bInput[k] && r.s[kPixelDen][k] != 0.0 && r.s[kLineDen][k] != 0.0 &&
                             lumo::WithinInverseTolerance(p[k] - s.pr[k], l[k] - s.lr[k]) &&
                             lumo::rf::IsPlaceOnEarth(psRF, dfX, y[k]);
            SetResult(i0 + k, bOk, dfX, y[k], a.padfOut1, a.padfOut2, a.panValid);
            if (!bOk) ++nFailed;
        }
    }
    return nFailed;
}

// Checks shared by both batch forms; false (with a warning) when the call
// cannot go ahead.
bool UsableBatch(const RFInfo_t* psRF, int nCount, const void* pIn1, const void* pIn2,
                 const void* pOut1, const void* pOut2) {
    if (nCount < 0) {
        lumo::Warn(lumo::Err::kBadArgument,
                   nova::FormatString("Rational function batch: point count %d is negative", nCount)
                       .c_str());
        return false;
    }
    if (nCount > 0 && (pIn1 == nullptr || pIn2 == nullptr || pOut1 == nullptr || pOut2 == nullptr ||
                       pOut1 == pOut2)) {
        lumo::Warn(lumo::Err::kBadArgument,
                   _("Rational function batch: a coordinate array is null, or both outputs "
                     "are the same array."));
        return false;
    }
    if (!lumo::rf::IsEvaluable(psRF)) {
        lumo::rf::ReportUnusableRecord(psRF);
        return false;
    }
    return true;
}

// Both forms: ranges of points to fnRange (which returns how many of its
// points failed), across threads for large batches; 1 when none failed.
template <typename RangeFn>
int RunBatch(int nCount, std::size_t nMinPerThread, RangeFn fnRange) {
    std::atomic<std::size_t> nFailed{0};
    nova::ForEachRange(
        static_cast<std::size_t>(nCount), nMinPerThread,
        [&](std::size_t nBegin, std::size_t nEnd) { nFailed += fnRange(nBegin, nEnd); });
    return nFailed == 0 ? 1 : 0;
}

// Names the first point of an inverse batch whose pixel, line or height is
// not finite (before anything is written: an output may be an input).
void ReportFirstBadInput(int nCount, const double* padfPixel, const double* padfLine,
                         const double* padfZ) {
    for (int i = 0; i < nCount; ++i) {
        const double adfValue[3] = {padfPixel[i], padfLine[i], padfZ != nullptr ? padfZ[i] : 0.0};
        const char* apszName[3] = {"pixel", "line", "height"};
        for (int k = 0; k < 3; ++k) {
            if (std::isfinite(adfValue[k])) continue;
            lumo::Warn(lumo::Err::kBadArgument,
                       nova::FormatString("Rational function batch: point %d has %s = %g, not a "
                                          "finite value; it and any like it fail",
                                          i, apszName[k], adfValue[k])
                           .c_str());
            return;
        }
    }
}

}  // namespace

int RFGeo2ImgBatch(RFInfo_t* psRF, int nCount, const double* padfX, const double* padfY,
                   const double* padfZ, double* padfPixel, double* padfLine, int* panValid) {
    if (!UsableBatch(psRF, nCount, padfX, padfY, padfPixel, padfLine)) return 0;
    const SharedModel oModel(psRF);
    const BatchArgs a{psRF, &oModel, padfX, padfY, padfZ, padfPixel, padfLine, panValid};
    return RunBatch(nCount, kMinForwardPerThread, [&](std::size_t nBegin, std::size_t nEnd) {
        return ForwardRange(a, nBegin, nEnd);
    });
}

int RFImg2GeoBatch(RFInfo_t* psRF, int nCount, const double* padfPixel, const double* padfLine,
                   const double* padfZ, double* padfX, double* padfY, int* panValid) {
    if (!UsableBatch(psRF, nCount, padfPixel, padfLine, padfX, padfY)) return 0;
    ReportFirstBadInput(nCount, padfPixel, padfLine, padfZ);
    const SharedModel oModel(psRF);
    const BatchArgs a{psRF, &oModel, padfPixel, padfLine, padfZ, padfX, padfY, panValid};
    return RunBatch(nCount, kMinInversePerThread, [&](std::size_t nBegin, std::size_t nEnd) {
        return InverseRange(a, nBegin, nEnd);
    });
}
