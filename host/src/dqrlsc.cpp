// Least squares by Householder QR with column pivoting, for square systems.
//
// The factorisation runs on LAPACK and a BLAS. Small matrices use LAPACK's
// column-pivoted QR (dgeqp3), which picks every pivot by exact column norms.
// That routine spends half its work in matrix-vector products over the whole
// trailing matrix, one per column, so for large matrices it is bound by memory
// bandwidth. Large matrices therefore choose each block of pivots from a small
// random sketch of the trailing matrix (Y = G A, G Gaussian with a fixed seed,
// so results are reproducible), order the chosen block by an exact pivoted QR
// of those columns alone and update the trailing matrix with blocked
// reflectors: nearly all the work is matrix-matrix products. R keeps its
// rank-revealing shape (a decreasing diagonal within each block, a trailing
// matrix that is small once the rank is exhausted).
#include <cblas.h>
#include <lapack.h>

#include <Eigen/Dense>
#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <random>
#include <vector>

#include "regression.h"

namespace {

using StridedMap = Eigen::Map<Eigen::MatrixXd, 0, Eigen::OuterStride<>>;

// From this order on the pivots are chosen block by block from a sketch.
constexpr int kSketchedFrom = 256;
constexpr int kBlock = 64;      // pivots chosen per sketch
constexpr int kOversample = 8;  // extra sketch rows for a reliable choice
constexpr std::uint64_t kSketchSeed = 0x5eed5eedULL;

double* Column(double* a, int lda, int j) {
    return a + static_cast<std::ptrdiff_t>(j) * lda;
}

// Workspace of one LAPACK call, grown to the size the routine asks for.
double* GrowWork(std::vector<double>& work, double query) {
    const auto want = static_cast<std::size_t>(std::max(1.0, query));
    if (work.size() < want) work.resize(want);
    return work.data();
}

// LAPACK's column-pivoted QR of the m x n matrix at a; jpvt receives the
// 1-based pivots. All columns are free to move.
void PivotedQr(int m, int n, double* a, int lda, int* jpvt, double* tau,
               std::vector<double>& work) {
    std::fill(jpvt, jpvt + n, 0);
    int info = 0;
    int lwork = -1;
    double query = 0.0;
    LAPACK_dgeqp3(&m, &n, a, &lda, jpvt, tau, &query, &lwork, &info);
    double* w = GrowWork(work, query);
    lwork = static_cast<int>(work.size());
    LAPACK_dgeqp3(&m, &n, a, &lda, jpvt, tau, w, &lwork, &info);
}

// C = Q^T C for the first k reflectors stored in v (m rows), C m x n.
void ApplyReflectorsTransposed(int m, int n, int k, const double* v, int ldv, const double* tau,
                               double* c, int ldc, std::vector<double>& work) {
    const char side = 'L';
    const char trans = 'T';
    int info = 0;
    int lwork = -1;
    double query = 0.0;
    LAPACK_dormqr(&side, &trans, &m, &n, &k, v, &ldv, tau, c, &ldc, &query, &lwork, &info);
    double* w = GrowWork(work, query);
    lwork = static_cast<int>(work.size());
    LAPACK_dormqr(&side, &trans, &m, &n, &k, v, &ldv, tau, c, &ldc, w, &lwork, &info);
}

// Factorisation of the matrix, its pivots and the state of the sketch.
struct Factoriser {
    double* a;
    int lda;
    int n;
    int* jpvt;
    double* tau;
    std::vector<double> work;
    std::vector<double> gauss;    // G: kSketch x n, leading dimension kSketch
    std::vector<double> sketch;   // Y = G A(k:, k:), column j of A at column j
    std::vector<double> scratch;  // the sketch being ranked (LAPACK overwrites it)
    std::vector<int> pivots;      // 1-based pivots of a LAPACK call
    std::vector<double> sketchTau;
    std::vector<double> top;  // rows above a panel and sketch columns, for reordering
    static constexpr int kSketch = kBlock + kOversample;

    double* SketchColumn(int j) { return sketch.data() + static_cast<std::size_t>(j) * kSketch; }

    void SwapColumns(int i, int j) {
        if (i == j) return;
        std::swap_ranges(Column(a, lda, i), Column(a, lda, i) + n, Column(a, lda, j));
        std::swap_ranges(SketchColumn(i), SketchColumn(i) + kSketch, SketchColumn(j));
        std::swap(jpvt[i], jpvt[j]);
    }

    // Brings the columns k + chosen[0..b) to positions k..k+b, in that order.
    void MoveToFront(int k, int b, const int* chosen) {
        const int c = n - k;
        std::vector<int> at(c), where(c);  // column at a position, position of a column
        for (int p = 0; p < c; ++p) at[p] = where[p] = p;
        for (int i = 0; i < b; ++i) {
            const int p = where[chosen[i]];
            SwapColumns(k + i, k + p);
            const int q = at[i];
            std::swap(at[i], at[p]);
            where[q] = p;
            where[chosen[i]] = i;
        }
    }

    void SketchTrailing(int k) {
        const int m = n - k;
        cblas_dgemm(CblasColMajor, CblasNoTrans, CblasNoTrans, kSketch, m, m, 1.0, gauss.data(),
                    kSketch, Column(a, lda, k) + k, lda, 0.0, SketchColumn(k), kSketch);
    }

    // Chooses the next b pivot columns by a pivoted QR of the sketch.
    void ChooseBlock(int k, int b) {
        const int m = n - k;
        scratch.assign(SketchColumn(k), SketchColumn(n));
        PivotedQr(kSketch, m, scratch.data(), kSketch, pivots.data(), sketchTau.data(), work);
        for (int i = 0; i < b; ++i) --pivots[i];
        MoveToFront(k, b, pivots.data());
    }

    // Reorders the b columns at k by the panel's pivots in the rows above
    // the panel (rows) and in the sketch.
    void ReorderAbove(int k, int b, int rows, double* base, int ld) {
        top.resize(static_cast<std::size_t>(rows) * b);
        for (int j = 0; j < b; ++j)
            std::copy_n(base + static_cast<std::size_t>(k + j) * ld, rows,
                        top.data() + static_cast<std::size_t>(j) * rows);
        for (int j = 0; j < b; ++j)
            std::copy_n(top.data() + static_cast<std::size_t>(pivots[j] - 1) * rows, rows,
                        base + static_cast<std::size_t>(k + j) * ld);
    }

    // Exact pivoted QR of the b columns at k, then Q^T on the trailing matrix.
    void ReducePanel(int k, int b, bool sketched) {
        const int m = n - k;
        PivotedQr(m, b, Column(a, lda, k) + k, lda, pivots.data(), tau + k, work);
        ReorderAbove(k, b, k, a, lda);
        if (sketched) ReorderAbove(k, b, kSketch, sketch.data(), kSketch);
        std::vector<int> ids(jpvt + k, jpvt + k + b);
        for (int j = 0; j < b; ++j) jpvt[k + j] = ids[pivots[j] - 1];
        if (k + b < n)
            ApplyReflectorsTransposed(m, n - k - b, b, Column(a, lda, k) + k, lda, tau + k,
                                      Column(a, lda, k + b) + k, lda, work);
    }

    // With Y = G Q [R11 R12; 0 A22], Y2 - Y1 R11^-1 R12 = (G Q)(:, b:) A22 is
    // a sketch of the new trailing matrix. Returns false (sketch afresh) when
    // R11 is too ill-conditioned for that update to be accurate.
    bool DowndateSketch(int k, int b) {
        const double* r11 = Column(a, lda, k) + k;
        double lo = std::abs(r11[0]);
        double hi = lo;
        for (int j = 1; j < b; ++j) {
            const double d = std::abs(r11[static_cast<std::size_t>(j) * lda + j]);
            lo = std::min(lo, d);
            hi = std::max(hi, d);
        }
        if (!(lo > 1e-6 * hi)) return false;
        const int rest = n - k - b;
        // T = R11^-1 R12, then Y2 -= Y1 T.
        scratch.resize(static_cast<std::size_t>(b) * rest);
        for (int j = 0; j < rest; ++j)
            std::copy_n(Column(a, lda, k + b + j) + k, b,
                        scratch.data() + static_cast<std::size_t>(j) * b);
        cblas_dtrsm(CblasColMajor, CblasLeft, CblasUpper, CblasNoTrans, CblasNonUnit, b, rest, 1.0,
                    r11, lda, scratch.data(), b);
        cblas_dgemm(CblasColMajor, CblasNoTrans, CblasNoTrans, kSketch, rest, b, -1.0,
                    SketchColumn(k), kSketch, scratch.data(), b, 1.0, SketchColumn(k + b), kSketch);
        return true;
    }

    void Run() {
        for (int j = 0; j < n; ++j) jpvt[j] = j;
        if (n < kSketchedFrom) {
            PivotedQr(n, n, a, lda, jpvt, tau, work);
            for (int j = 0; j < n; ++j) --jpvt[j];
            return;
        }
        std::mt19937_64 rng(kSketchSeed);
        std::normal_distribution<double> normal;
        gauss.resize(static_cast<std::size_t>(kSketch) * n);
        for (double& g : gauss) g = normal(rng);
        sketch.resize(static_cast<std::size_t>(kSketch) * n);
        sketchTau.resize(kSketch);
        pivots.resize(n);
        bool current = false;  // whether the sketch describes the trailing matrix
        for (int k = 0; k < n;) {
            const int b = std::min(kBlock, n - k);
            const bool sketched = n - k > b;
            if (sketched) {
                if (!current) SketchTrailing(k);
                ChooseBlock(k, b);
            }
            ReducePanel(k, b, sketched);
            current = sketched && k + b < n && DowndateSketch(k, b);
            k += b;
        }
    }
};

void Factorise(double* a, int lda, int n, int* jpvt, double* tau) {
    Factoriser f{a, lda, n, jpvt, tau, {}, {}, {}, {}, {}, {}, {}};
    f.Run();
}

// Applies Q^T (transpose = true) or Q to c in place; Q = H_0 H_1 ... H_{n-1}.
void ApplyQ(const StridedMap& a, int n, const double* tau, Eigen::VectorXd& c, bool transpose) {
    for (int step = 0; step < n; ++step) {
        const int k = transpose ? step : n - 1 - step;
        if (tau[k] == 0.0) continue;
        const int len = n - k - 1;
        double w = c[k];
        if (len > 0) w += a.col(k).tail(len).dot(c.tail(len));
        w *= tau[k];
        c[k] -= w;
        if (len > 0) c.tail(len) -= w * a.col(k).tail(len);
    }
}

int NumericalRank(const StridedMap& a, int n, double tol) {
    const double r00 = std::abs(a(0, 0));
    if (!(r00 > 0.0)) return 0;
    int rank = 1;
    while (rank < n && std::abs(a(rank, rank)) > tol * r00) ++rank;
    return rank;
}

bool AllFinite(const double* values, int count) {
    for (int i = 0; i < count; ++i)
        if (!std::isfinite(values[i])) return false;
    return true;
}

// A factorisation left by a task -1 call: the pivots form a permutation and
// every reflector factor is 0 or in [1, 2].
bool LooksFactorised(const int* jpvt, const double* tau, int n) {
    std::vector<bool> seen(n, false);
    for (int k = 0; k < n; ++k) {
        if (jpvt[k] < 0 || jpvt[k] >= n || seen[jpvt[k]]) return false;
        seen[jpvt[k]] = true;
        if (!(tau[k] == 0.0 || (tau[k] >= 1.0 && tau[k] <= 2.0))) return false;
    }
    return true;
}

int CheckArguments(const double* A, int lda, int n, double tol, const int* rank, const double* b,
                   const double* x, const int* jpvt, const double* qraux, int task) {
    if (!A || !rank || !b || !x || !jpvt || !qraux) return DQRLSC_BAD_ARGUMENT;
    if (n < 1 || lda < n) return DQRLSC_BAD_ARGUMENT;
    if (!std::isfinite(tol) || tol < 0.0) return DQRLSC_BAD_ARGUMENT;
    if (task != -1 && task != 2) return DQRLSC_BAD_ARGUMENT;
    return DQRLSC_OK;
}

}  // namespace

void dqrlsc(double* A, int lda, int n, double tol, int* rank, double* b, double* x, double* rsd,
            int* jpvt, double* qraux, double* /*work*/, int task, int* ind) {
    int status = CheckArguments(A, lda, n, tol, rank, b, x, jpvt, qraux, task);
    if (status == DQRLSC_OK && !AllFinite(b, n)) status = DQRLSC_NOT_FINITE;
    if (status == DQRLSC_OK && task == 2 && !LooksFactorised(jpvt, qraux, n))
        status = DQRLSC_NO_FACTOR;
    StridedMap a(A, n, n, Eigen::OuterStride<>(std::max(lda, 1)));
    if (status == DQRLSC_OK && task == -1) {
        for (int j = 0; j < n && status == DQRLSC_OK; ++j)
            if (!AllFinite(A + static_cast<std::ptrdiff_t>(j) * lda, n)) status = DQRLSC_NOT_FINITE;
        if (status == DQRLSC_OK) Factorise(A, lda, n, jpvt, qraux);
    }
    if (status != DQRLSC_OK) {
        if (rank) *rank = 0;
        if (ind) *ind = status;
        return;
    }
    const int r = NumericalRank(a, n, tol);
    *rank = r;
    if (r == 0) {
        if (ind) *ind = DQRLSC_RANK_ZERO;
        return;
    }
    Eigen::VectorXd c = Eigen::Map<const Eigen::VectorXd>(b, n);
    ApplyQ(a, n, qraux, c, true);
    const Eigen::VectorXd z = a.topLeftCorner(r, r).triangularView<Eigen::Upper>().solve(c.head(r));
    for (int k = 0; k < n; ++k) x[jpvt[k]] = k < r ? z[k] : 0.0;
    if (rsd) {
        c.head(r).setZero();
        ApplyQ(a, n, qraux, c, false);
        Eigen::Map<Eigen::VectorXd>(rsd, n) = c;
    }
    if (ind) *ind = DQRLSC_OK;
}
