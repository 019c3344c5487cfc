// Thin plate spline: fitting by a dense symmetric system solved through its
// structure, or with the host's column-pivoted QR for degenerate point sets, evaluation with a
// vectorised radial sum, and the two-direction spline model record.
#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <utility>
#include <vector>

#include "errors.h"
#include "lumo_tps.h"
#include "null_value.h"
#include "projection.h"
#include "record_check.h"
#include "regression.h"
#include "runtime.h"
#include "tps_solve.h"

#if defined(__x86_64__) && defined(__GLIBC__) && defined(__GNUC__)
#include <immintrin.h>
#define LUMO_TPS_HAVE_AVX2 1
// glibc's vector math library (libmvec, reached through libm): the natural
// logarithm of four doubles, accurate to a few units in the last place.
extern "C" __attribute__((target("avx2"))) __m256d _ZGVdN4v_log(__m256d);
#endif

namespace {

[[noreturn]] void Fail(const char* text) {
    lumo::Fatal(lumo::Err::kComputation, text);
}

// ---------------------------------------------------------------------------
// Radial sums: sum over i < count of U(r²) = r² ln r² (0 at r = 0) between
// (x, y) and (xs[i], ys[i]), weighted by wx[i] and wy[i].
// ---------------------------------------------------------------------------

struct RadialSums {
    double x;
    double y;
};

RadialSums RadialSumsScalar(const double* xs, const double* ys, const double* wx, const double* wy,
                            int count, double x, double y) {
    RadialSums s{0.0, 0.0};
    for (int i = 0; i < count; ++i) {
        const double dx = x - xs[i];
        const double dy = y - ys[i];
        const double r2 = dy * dy + dx * dx;
        if (r2 > 0.0) {
            const double u = r2 * std::log(r2);
            s.x += u * wx[i];
            s.y += u * wy[i];
        }
    }
    return s;
}

#if defined(LUMO_TPS_HAVE_AVX2)
__attribute__((target("avx2,fma"))) double HorizontalSum(__m256d v) {
    const __m128d pair = _mm_add_pd(_mm256_castpd256_pd128(v), _mm256_extractf128_pd(v, 1));
    return _mm_cvtsd_f64(_mm_add_sd(pair, _mm_unpackhi_pd(pair, pair)));
}

// Four control points per step; the terms of coincident points (r² = 0, where
// r² ln r² would be 0 · -inf) are masked to 0.
__attribute__((target("avx2,fma"))) RadialSums RadialSumsAvx2(const double* xs, const double* ys,
                                                              const double* wx, const double* wy,
                                                              int count, double x, double y) {
    const __m256d px = _mm256_set1_pd(x);
    const __m256d py = _mm256_set1_pd(y);
    const __m256d zero = _mm256_setzero_pd();
    __m256d sx = zero;
    __m256d sy = zero;
    int i = 0;
    for (; i + 4 <= count; i += 4) {
        const __m256d dx = _mm256_sub_pd(px, _mm256_loadu_pd(xs + i));
        const __m256d dy = _mm256_sub_pd(py, _mm256_loadu_pd(ys + i));
        const __m256d r2 = _mm256_fmadd_pd(dx, dx, _mm256_mul_pd(dy, dy));
        const __m256d positive = _mm256_cmp_pd(r2, zero, _CMP_GT_OQ);
        const __m256d u = _mm256_and_pd(positive, _mm256_mul_pd(r2, _ZGVdN4v_log(r2)));
        sx = _mm256_fmadd_pd(u, _mm256_loadu_pd(wx + i), sx);
        sy = _mm256_fmadd_pd(u, _mm256_loadu_pd(wy + i), sy);
    }
    const RadialSums tail = RadialSumsScalar(xs + i, ys + i, wx + i, wy + i, count - i, x, y);
    return {HorizontalSum(sx) + tail.x, HorizontalSum(sy) + tail.y};
}
#endif

using RadialKernel = RadialSums (*)(const double*, const double*, const double*, const double*, int,
                                    double, double);

// The widest kernel this processor runs, chosen once.
RadialKernel ChooseKernel() {
#if defined(LUMO_TPS_HAVE_AVX2)
    __builtin_cpu_init();
    if (__builtin_cpu_supports("avx2") && __builtin_cpu_supports("fma")) return RadialSumsAvx2;
#endif
    return RadialSumsScalar;
}

const RadialKernel kRadialSums = ChooseKernel();

// ---------------------------------------------------------------------------
// Fitting.
// ---------------------------------------------------------------------------

struct Extent {
    double minX, maxX, minY, maxY;
};

Extent ExtentOf(const double* x, const double* y, int n) {
    Extent e{x[0], x[0], y[0], y[0]};
    for (int i = 1; i < n; ++i) {
        e.minX = std::min(e.minX, x[i]);
        e.maxX = std::max(e.maxX, x[i]);
        e.minY = std::min(e.minY, y[i]);
        e.maxY = std::max(e.maxY, y[i]);
    }
    return e;
}

bool AllAtOnePlace(const Extent& e) {
    return e.minX == e.maxX && e.minY == e.maxY;
}

void CheckInput(const TPSInfo_t* psTps, int n, const double* x, const double* y, const double* X,
                const double* Y) {
    if (psTps == nullptr) Fail(_("Thin plate spline fit: the spline is null."));
    if (n <= 0) return;
    if (x == nullptr || y == nullptr || X == nullptr || Y == nullptr)
        Fail(MkName(_("Thin plate spline fit: a coordinate array of the %d control points is "
                      "null."),
                    n));
    for (int i = 0; i < n; ++i)
        if (!std::isfinite(x[i]) || !std::isfinite(y[i]) || !std::isfinite(X[i]) ||
            !std::isfinite(Y[i]))
            Fail(MkName(_("Control point %d has a non-finite coordinate: (%g, %g) -> (%g, %g)."),
                        i + 1, x[i], y[i], X[i], Y[i]));
}

void SetIdentity(TPSInfo_t& t) {
    static const double kIdentity[6] = {0.0, 1.0, 0.0, 0.0, 0.0, 1.0};
    std::copy_n(kIdentity, 6, t.adfAffine);
    if (t.padfCoefX != nullptr) {
        std::copy_n(kIdentity, 3, t.padfCoefX);
        std::copy_n(kIdentity + 3, 3, t.padfCoefY);
    }
    t.nRank = 0;
    t.dfCondition = 0.0;
}

// Solution of the normalised system for n >= 4 points, in normalised units.
struct NormalisedFit {
    double scale;   // input scale s
    double scaleX;  // output scales S_X, S_Y
    double scaleY;
    double offsetX;  // output offsets, subtracted before scaling
    double offsetY;
};

double OutputScale(double lo, double hi) {
    const double s = std::max(std::abs(lo), std::abs(hi));
    return s > 0.0 ? s : 1.0;
}

// Largest residual of a control point accepted from the structured solve,
// relative to the output extent: a margin below the 1e-12 the fit promises,
// leaving room for the rounding of evaluation.
constexpr double kStructuredResidual = 2e-13;

// The structured solve, on outputs centred and scaled to [-1, 1] so that
// map coordinates far from the origin keep their precision. False when the
// points are degenerate for it.
bool SolveStructured(TPSInfo_t& t, int n, const std::vector<double>& xi,
                     const std::vector<double>& eta, const double* X, const double* Y,
                     const Extent& out, NormalisedFit& f) {
    auto centre = [](double lo, double hi, double& offset, double& scale) {
        offset = 0.5 * (lo + hi);
        scale = hi > lo ? 0.5 * (hi - lo) : 1.0;
    };
    NormalisedFit g = f;
    centre(out.minX, out.maxX, g.offsetX, g.scaleX);
    centre(out.minY, out.maxY, g.offsetY, g.scaleY);
    std::vector<double> vx(n), vy(n);
    for (int i = 0; i < n; ++i) {
        vx[i] = (X[i] - g.offsetX) / g.scaleX;
        vy[i] = (Y[i] - g.offsetY) / g.scaleY;
    }
    double condition = 0.0;
    if (!lumo::SolveSplineStructured(n, xi.data(), eta.data(), vx.data(), vy.data(),
                                     2.0 * kStructuredResidual, t.padfCoefX, t.padfCoefY,
                                     &condition))
        return false;
    t.nRank = n + 3;
    t.dfCondition = condition;
    f = g;
    return true;
}

// Builds and solves the (n + 3) x (n + 3) spline system into the coefficient
// arrays of t: by the structured solve when the points allow it, otherwise
// by the rank-revealing pivoted QR (duplicates, collinear points), which
// raises error 100 when the system is singular. All working storage lives in
// this call only.
NormalisedFit SolveNormalised(TPSInfo_t& t, int n, const double* x, const double* y,
                              const double* X, const double* Y, const Extent& in,
                              const Extent& out) {
    NormalisedFit f{};
    f.scale = std::max(in.maxX - in.minX, in.maxY - in.minY);
    if (!(f.scale > 0.0)) f.scale = 1.0;
    std::vector<double> xi(n), eta(n);
    for (int i = 0; i < n; ++i) {
        xi[i] = (x[i] - in.minX) / f.scale;
        eta[i] = (y[i] - in.minY) / f.scale;
    }
    if (SolveStructured(t, n, xi, eta, X, Y, out, f)) return f;

    f.scaleX = OutputScale(out.minX, out.maxX);
    f.scaleY = OutputScale(out.minY, out.maxY);
    const int m = n + 3;
    const auto ld = static_cast<std::size_t>(m);
    std::vector<double> a(ld * ld, 0.0);  // column-major
    auto at = [&](int r, int c) -> double& { return a[static_cast<std::size_t>(c) * ld + r]; };
    double largest = 1.0;
    for (int i = 0; i < n; ++i) {
        at(3 + i, 0) = at(0, 3 + i) = 1.0;
        at(3 + i, 1) = at(1, 3 + i) = xi[i];
        at(3 + i, 2) = at(2, 3 + i) = eta[i];
        double* column = &at(0, 3 + i);
        for (int j = i + 1; j < n; ++j) {
            const double dx = xi[i] - xi[j];
            const double dy = eta[i] - eta[j];
            const double r2 = dx * dx + dy * dy;
            const double u = r2 > 0.0 ? r2 * std::log(r2) : 0.0;
            column[3 + j] = u;
            largest = std::max(largest, std::abs(u));
        }
    }
    for (int i = 0; i < n; ++i)  // mirror the lower triangle
        for (int j = i + 1; j < n; ++j) at(3 + i, 3 + j) = at(3 + j, 3 + i);

    std::vector<double> bx(ld, 0.0), by(ld, 0.0), qraux(ld);
    std::vector<int> jpvt(ld);
    for (int i = 0; i < n; ++i) {
        bx[3 + i] = X[i] / f.scaleX;
        by[3 + i] = Y[i] / f.scaleY;
    }
    const double tol = 1e-12 / largest;
    int rank = 0;
    int ind = 0;
    dqrlsc(a.data(), m, m, tol, &rank, bx.data(), t.padfCoefX, nullptr, jpvt.data(), qraux.data(),
           nullptr, -1, &ind);
    t.nRank = rank;
    t.dfCondition = 0.0;
    if (rank == 0 || ind != DQRLSC_OK) Fail(_("Matrix is singular. Please check your GCPs."));
    t.dfCondition = std::abs(at(0, 0) / at(rank - 1, rank - 1));
    dqrlsc(a.data(), m, m, tol, &rank, by.data(), t.padfCoefY, nullptr, jpvt.data(), qraux.data(),
           nullptr, 2, &ind);
    if (rank == 0 || ind != DQRLSC_OK) Fail(_("Matrix is singular. Please check your GCPs."));
    return f;
}

// Brings the normalised solution back to the input and output units: with
// U(r²/s²) = (U(r²) - 2 ln s · r²) / s² and the weights orthogonal to the
// affine part, the second term collapses into the constant.
void Unnormalise(TPSInfo_t& t, int n, const double* x, const double* y, const Extent& in,
                 const NormalisedFit& f) {
    const double logTerm = 2.0 * std::log(f.scale);
    const double s2 = f.scale * f.scale;
    double sumX = 0.0;
    double sumY = 0.0;
    for (int i = 0; i < n; ++i) {
        const double xi = (x[i] - in.minX) / f.scale;
        const double eta = (y[i] - in.minY) / f.scale;
        const double rho2 = xi * xi + eta * eta;
        sumX += rho2 * t.padfCoefX[3 + i];
        sumY += rho2 * t.padfCoefY[3 + i];
        t.padfCoefX[3 + i] *= f.scaleX / s2;
        t.padfCoefY[3 + i] *= f.scaleY / s2;
    }
    double* cx = t.padfCoefX;
    double* cy = t.padfCoefY;
    cx[0] = (cx[0] - (in.minY * cx[2] + in.minX * cx[1]) / f.scale - logTerm * sumX) * f.scaleX +
            f.offsetX;
    cx[1] = cx[1] * f.scaleX / f.scale;
    cx[2] = cx[2] * f.scaleX / f.scale;
    cy[0] = (cy[0] - (in.minY * cy[2] + in.minX * cy[1]) / f.scale - logTerm * sumY) * f.scaleY +
            f.offsetY;
    cy[1] = cy[1] * f.scaleY / f.scale;
    cy[2] = cy[2] * f.scaleY / f.scale;
}

// Fits n >= 1 points into t, whose arrays hold at least n points.
void Fit(TPSInfo_t& t, int n, const double* x, const double* y, const double* X, const double* Y) {
    if (n == 1) {
        t.padfCoefX[0] = t.adfAffine[0] = X[0] - x[0];
        t.padfCoefY[0] = t.adfAffine[3] = Y[0] - y[0];
        t.nRank = 1;
        return;
    }
    std::copy_n(x, n, t.padfCPX);
    std::copy_n(y, n, t.padfCPY);
    const Extent in = ExtentOf(x, y, n);
    const Extent out = ExtentOf(X, Y, n);
    if (AllAtOnePlace(in) || AllAtOnePlace(out))
        Fail(_("All GCP coordinates are equal. Please check your GCPs."));

    GEOInfo_t affine{};
    int order = 1;
    double rmsX = 0.0;
    double rmsY = 0.0;
    GCPRegression2(&affine, "PIXEL", const_cast<double*>(x), const_cast<double*>(y), "METRE",
                   const_cast<double*>(X), const_cast<double*>(Y), n, &order, 0, &rmsX, &rmsY);
    std::copy_n(affine.adfAffine, 6, t.adfAffine);
    if (n <= 3) {
        std::copy_n(affine.adfXCoeffs, 3, t.padfCoefX);
        std::copy_n(affine.adfYCoeffs, 3, t.padfCoefY);
        t.nRank = n;
        return;
    }
    const NormalisedFit f = SolveNormalised(t, n, x, y, X, Y, in, out);
    Unnormalise(t, n, x, y, in, f);
}

void SwapSplines(TPSInfo_t& a, TPSInfo_t& b) {
    std::swap(a.nCPs, b.nCPs);
    std::swap(a.padfCPX, b.padfCPX);
    std::swap(a.padfCPY, b.padfCPY);
    std::swap(a.padfCoefX, b.padfCoefX);
    std::swap(a.padfCoefY, b.padfCoefY);
    std::swap(a.adfAffine, b.adfAffine);
    std::swap(a.nRank, b.nRank);
    std::swap(a.dfCondition, b.dfCondition);
    std::swap(a.nAllocCPs, b.nAllocCPs);
}

}  // namespace

// ---------------------------------------------------------------------------
// TPSInfo_t
// ---------------------------------------------------------------------------

TPSInfo_t::TPSInfo_t(int nNumCPs) {
    Init();
    SetNumCPs(nNumCPs);
}

TPSInfo_t::TPSInfo_t(const TPSInfo_t& oOther) {
    Init();
    CopyFrom(oOther);
}

TPSInfo_t& TPSInfo_t::operator=(const TPSInfo_t& oOther) {
    if (this != &oOther) CopyFrom(oOther);
    return *this;
}

TPSInfo_t::~TPSInfo_t() {
    SetNumCPs(0);
}

void TPSInfo_t::Init() {
    nCPs = 0;
    padfCPX = nullptr;
    padfCPY = nullptr;
    padfCoefX = nullptr;
    padfCoefY = nullptr;
    std::fill_n(adfAffine, 6, 0.0);
    nRank = 0;
    dfCondition = 0.0;
    nAllocCPs = 0;
}

void TPSInfo_t::SetNumCPs(int nNumCPs) {
    const int nWanted = std::max(nNumCPs, 0);
    if (nWanted == nAllocCPs) return;
    // Allocate before releasing, so that a failed allocation keeps the spline.
    std::unique_ptr<double[]> x, y, cx, cy;
    if (nWanted > 0) {
        const auto points = static_cast<std::size_t>(nWanted);
        x.reset(new double[points]());
        y.reset(new double[points]());
        cx.reset(new double[points + 3]());
        cy.reset(new double[points + 3]());
    }
    delete[] padfCPX;
    delete[] padfCPY;
    delete[] padfCoefX;
    delete[] padfCoefY;
    padfCPX = x.release();
    padfCPY = y.release();
    padfCoefX = cx.release();
    padfCoefY = cy.release();
    nAllocCPs = nWanted;
}

void TPSInfo_t::CopyFrom(const TPSInfo_t& oOther) {
    SetNumCPs(oOther.nAllocCPs);
    if (nAllocCPs > 0) {
        std::copy_n(oOther.padfCPX, nAllocCPs, padfCPX);
        std::copy_n(oOther.padfCPY, nAllocCPs, padfCPY);
        std::copy_n(oOther.padfCoefX, nAllocCPs + 3, padfCoefX);
        std::copy_n(oOther.padfCoefY, nAllocCPs + 3, padfCoefY);
    }
    nCPs = oOther.nCPs;
    std::copy_n(oOther.adfAffine, 6, adfAffine);
    nRank = oOther.nRank;
    dfCondition = oOther.dfCondition;
}

// ---------------------------------------------------------------------------
// Free functions of the spline.
// ---------------------------------------------------------------------------

void TPSCalculate(TPSInfo_t* psTps, int n, double* padfX, double* padfY, double* padfOutX,
                  double* padfOutY) {
    CheckInput(psTps, n, padfX, padfY, padfOutX, padfOutY);
    // The fit is made in a spline of its own, sized for the points, and
    // swapped in only when it succeeds: a failed fit keeps the former spline.
    TPSInfo_t oFit(std::max(n, psTps->nAllocCPs));
    oFit.nCPs = n >= 4 ? n : 0;
    SetIdentity(oFit);
    if (n >= 1) Fit(oFit, n, padfX, padfY, padfOutX, padfOutY);
    SwapSplines(*psTps, oFit);
}

void TPSTransform(TPSInfo_t* psTps, double dfX, double dfY, double* pdfOutX, double* pdfOutY) {
    if (psTps == nullptr || pdfOutX == nullptr || pdfOutY == nullptr) return;
    const double* cx = psTps->padfCoefX;
    const double* cy = psTps->padfCoefY;
    if (cx == nullptr || cy == nullptr) {  // never fitted and never sized: identity
        *pdfOutX = dfX;
        *pdfOutY = dfY;
        return;
    }
    const int nPoints = std::min(psTps->nCPs, psTps->nAllocCPs);
    const RadialSums s =
        kRadialSums(psTps->padfCPX, psTps->padfCPY, cx + 3, cy + 3, nPoints, dfX, dfY);
    *pdfOutX = cx[1] * dfX + cx[0] + cx[2] * dfY + s.x;
    *pdfOutY = cy[1] * dfX + cy[0] + cy[2] * dfY + s.y;
}

void TPSRMSError(TPSInfo_t* psTps, int n, double* padfX, double* padfY, double* padfOutX,
                 double* padfOutY, double* pdfMeanX, double* pdfMeanY, double* pdfRmsX,
                 double* pdfRmsY) {
    if (pdfMeanX == nullptr || pdfMeanY == nullptr || pdfRmsX == nullptr || pdfRmsY == nullptr)
        Fail(_("Thin plate spline residuals: an output pointer is null."));
    *pdfMeanX = *pdfMeanY = *pdfRmsX = *pdfRmsY = 0.0;
    if (n < 1) return;
    CheckInput(psTps, n, padfX, padfY, padfOutX, padfOutY);
    double sumX = 0.0, sumY = 0.0, sumSqX = 0.0, sumSqY = 0.0;
    for (int i = 0; i < n; ++i) {
        double tx = 0.0;
        double ty = 0.0;
        TPSTransform(psTps, padfX[i], padfY[i], &tx, &ty);
        const double dx = tx - padfOutX[i];
        const double dy = ty - padfOutY[i];
        sumX += dx;
        sumY += dy;
        sumSqX += dx * dx;
        sumSqY += dy * dy;
    }
    *pdfMeanX = sumX / n;
    *pdfMeanY = sumY / n;
    *pdfRmsX = std::sqrt(sumSqX / n);
    *pdfRmsY = std::sqrt(sumSqY / n);
}

// ---------------------------------------------------------------------------
// Spline model record.
// ---------------------------------------------------------------------------

namespace {

struct TrnDeleter {
    void operator()(TRNInfo_t* p) const { TRNDeallocate(p); }
};
using TrnHolder = std::unique_ptr<TRNInfo_t, TrnDeleter>;
template <typename T>
using FreeHolder = std::unique_ptr<T, nova::FreeDeleter>;

// Makes dst transform as src: a deep copy of the spline and the fitted flag.
void CopyContainer(TRNInfo_t* psDst, const TRNInfo_t* psSrc) {
    if (psDst == nullptr || psSrc == nullptr || psDst == psSrc) return;
    if (psDst->nType != TRN_TPS || psSrc->nType != TRN_TPS) return;
    const auto* psFrom = static_cast<const TPSInfo_t*>(psSrc->pModel);
    auto* psTo = static_cast<TPSInfo_t*>(psDst->pModel);
    if (psFrom == nullptr) return;
    if (psTo == nullptr)
        psDst->pModel = new TPSInfo_t(*psFrom);
    else
        *psTo = *psFrom;
    psDst->bCalculated = psSrc->bCalculated;
}

}  // namespace

TPSMInfo_t* TPSAllocate(TPSMInfo_t* psExisting) {
    FreeHolder<TPSMInfo_t> psNew(static_cast<TPSMInfo_t*>(HCalloc(1, sizeof(TPSMInfo_t))));
    TrnHolder psGeoToImage(TRNAllocate(TRN_TPS));
    TrnHolder psImageToGeo(TRNAllocate(TRN_TPS));
    FreeHolder<char> pszGeosys(static_cast<char*>(HCalloc(TPS_GEOSYS_SIZE, 1)));
    FreeHolder<ProjInfo_t> psProj(static_cast<ProjInfo_t*>(HMalloc(sizeof(ProjInfo_t))));
    InitProjInfo(psProj.get(), 0);

    TPSMInfo_t* psTarget = psExisting != nullptr ? psExisting : psNew.get();
    psTarget->psGeoToImage = psGeoToImage.release();
    psTarget->psImageToGeo = psImageToGeo.release();
    psTarget->pszGeosys = pszGeosys.release();
    psTarget->psProjInfo = psProj.release();
    if (psExisting != nullptr) return psExisting;  // psNew's own block is freed
    return psNew.release();
}

void TPSCopy(TPSMInfo_t* psDst, const TPSMInfo_t* psSrc) {
    if (psDst == nullptr || psSrc == nullptr || psDst == psSrc) return;
    psDst->nLines = psSrc->nLines;
    psDst->nPixels = psSrc->nPixels;
    if (psDst->pszGeosys != nullptr && psSrc->pszGeosys != nullptr)
        std::memcpy(psDst->pszGeosys, psSrc->pszGeosys, TPS_GEOSYS_SIZE);
    if (psDst->psProjInfo != nullptr && psSrc->psProjInfo != nullptr)
        *psDst->psProjInfo = *psSrc->psProjInfo;
    CopyContainer(psDst->psGeoToImage, psSrc->psGeoToImage);
    CopyContainer(psDst->psImageToGeo, psSrc->psImageToGeo);
}

void TPSDeallocate(TPSMInfo_t* psModel) {
    if (psModel == nullptr) return;
    std::free(psModel->psProjInfo);
    std::free(psModel->pszGeosys);
    TRNDeallocate(psModel->psGeoToImage);
    TRNDeallocate(psModel->psImageToGeo);
    std::free(psModel);
}

namespace {

// One direction: a fitted spline whose arrays hold its points and
// coefficients, all finite.
std::string CheckDirection(const TRNInfo_t* psTrn, const std::string& osName) {
    if (psTrn == nullptr || psTrn->nType != TRN_TPS || psTrn->pModel == nullptr) {
        return osName + ": the direction holds no spline";
    }
    if (psTrn->bCalculated == 0) {
        return lumo::FieldProblem(osName + ".bCalculated", 0,
                                  "the direction was never fitted (it would give zeros)");
    }
    const auto& spline = *static_cast<const TPSInfo_t*>(psTrn->pModel);
    if (spline.nCPs < 0 || spline.nCPs > spline.nAllocCPs) {
        return lumo::FieldProblem(
            osName + ".nCPs", spline.nCPs,
            "must lie in 0.." + std::to_string(spline.nAllocCPs) + " (the points the arrays hold)");
    }
    if (spline.padfCoefX == nullptr || spline.padfCoefY == nullptr ||
        (spline.nCPs > 0 && (spline.padfCPX == nullptr || spline.padfCPY == nullptr))) {
        return osName + ": the spline's arrays are null";
    }
    const std::string osPrefix = osName + ".";
    std::string problem =
        lumo::FirstNonFinite((osPrefix + "padfCoefX").c_str(), spline.padfCoefX, spline.nCPs + 3);
    if (problem.empty()) {
        problem = lumo::FirstNonFinite((osPrefix + "padfCoefY").c_str(), spline.padfCoefY,
                                       spline.nCPs + 3);
    }
    if (problem.empty()) {
        problem = lumo::FirstNonFinite((osPrefix + "padfCPX").c_str(), spline.padfCPX, spline.nCPs);
    }
    if (problem.empty()) {
        problem = lumo::FirstNonFinite((osPrefix + "padfCPY").c_str(), spline.padfCPY, spline.nCPs);
    }
    return problem;
}

}  // namespace

std::string TPSValidate(const TPSMInfo_t* psModel) {
    if (psModel == nullptr) return "the record is null";
    const std::string problem = CheckDirection(psModel->psGeoToImage, "psGeoToImage");
    return problem.empty() ? CheckDirection(psModel->psImageToGeo, "psImageToGeo") : problem;
}

// A point the spline cannot map (not finite, or no fit) has no position:
// both outputs hold the null value rather than the container's zeros, which
// a caller could not tell from a real position.
void TPSGeo2Img(TPSMInfo_t* psModel, double dfX, double dfY, double* pdfPixel, double* pdfLine) {
    if (psModel == nullptr) return;
    if (TRNTransform(psModel->psGeoToImage, dfX, dfY, pdfPixel, pdfLine) == 0) {
        lumo::SetNullPair(pdfPixel, pdfLine);
    }
}

void TPSImg2Geo(TPSMInfo_t* psModel, double dfPixel, double dfLine, double* pdfX, double* pdfY) {
    if (psModel == nullptr) return;
    if (TRNTransform(psModel->psImageToGeo, dfPixel, dfLine, pdfX, pdfY) == 0) {
        lumo::SetNullPair(pdfX, pdfY);
    }
}
