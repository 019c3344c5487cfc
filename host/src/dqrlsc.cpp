// Least squares by Householder QR with column pivoting, for square systems.
//
// The factorisation is blocked: each panel of columns is reduced with the
// pivoting and reflector generation done column by column, while the update
// of the trailing matrix is deferred and applied once per panel as a matrix
// product (A22 -= V F^T). Partial column norms are downdated as columns are
// eliminated and recomputed when cancellation makes the downdate unreliable;
// a panel ends early when that happens, so every pivot choice sees exact
// norms.
#include <Eigen/Dense>
#include <algorithm>
#include <cmath>
#include <limits>
#include <vector>

#include "regression.h"

namespace {

using StridedMap = Eigen::Map<Eigen::MatrixXd, 0, Eigen::OuterStride<>>;

constexpr int kPanelWidth = 32;

// Turns x (length len) into the Householder vector of the reflector
// H = I - tau v v^T with H x = beta e1: x[0] becomes beta, x[1..] the vector
// below its unit leading entry. tau is 0 (H = I) or lies in [1, 2].
double MakeReflector(double* x, int len) {
    if (len <= 1) return 0.0;
    Eigen::Map<Eigen::VectorXd> tail(x + 1, len - 1);
    const double tailNorm = tail.norm();
    if (tailNorm == 0.0) return 0.0;
    const double alpha = x[0];
    const double beta = -std::copysign(std::hypot(alpha, tailNorm), alpha);
    tail /= (alpha - beta);
    x[0] = beta;
    return (beta - alpha) / beta;
}

struct PanelState {
    StridedMap& a;
    int n;
    int* jpvt;
    double* tau;
    std::vector<double>& vn1;  // downdated norms of the unreduced column parts
    std::vector<double>& vn2;  // norms when last computed exactly
    Eigen::MatrixXd& f;        // deferred update factors, one row per column of the panel
};

// Reduces up to kPanelWidth columns starting at column j0 and applies the
// deferred update to the trailing matrix. Returns the number of columns reduced.
int ReducePanel(PanelState& s, int j0) {
    const int n = s.n;
    const int ncols = n - j0;
    const int nb = std::min(kPanelWidth, ncols);
    const double tol3z = std::sqrt(std::numeric_limits<double>::epsilon());
    std::vector<int> stale;  // columns whose norm must be recomputed
    s.f.setZero(ncols, nb);
    int k = 0;
    while (k < nb && stale.empty()) {
        const int rk = j0 + k;
        const int h = n - rk;  // rows from the pivot down
        int pvt = rk;
        for (int j = rk + 1; j < n; ++j)
            if (s.vn1[j] > s.vn1[pvt]) pvt = j;
        if (pvt != rk) {
            s.a.col(pvt).swap(s.a.col(rk));
            s.f.row(pvt - j0).head(k).swap(s.f.row(k).head(k));
            std::swap(s.jpvt[pvt], s.jpvt[rk]);
            s.vn1[pvt] = s.vn1[rk];
            s.vn2[pvt] = s.vn2[rk];
        }
        // Bring the pivot column up to date with this panel's earlier reflectors.
        if (k > 0)
            s.a.block(rk, rk, h, 1).noalias() -=
                s.a.block(rk, j0, h, k) * s.f.block(k, 0, 1, k).transpose();
        s.tau[rk] = MakeReflector(&s.a(rk, rk), h);
        const double akk = s.a(rk, rk);
        s.a(rk, rk) = 1.0;
        const double t = s.tau[rk];
        // Column k of F: tau * A(rk:, rk+1:)^T v, corrected for the earlier
        // reflectors of the panel.
        if (rk < n - 1)
            s.f.block(k + 1, k, ncols - k - 1, 1).noalias() =
                t * s.a.block(rk, rk + 1, h, n - rk - 1).transpose() * s.a.block(rk, rk, h, 1);
        if (k > 0) {
            const Eigen::VectorXd aux =
                -t * s.a.block(rk, j0, h, k).transpose() * s.a.block(rk, rk, h, 1);
            s.f.col(k).noalias() += s.f.leftCols(k) * aux;
        }
        // The pivot row is needed in full for the norm downdates.
        if (rk < n - 1)
            s.a.block(rk, rk + 1, 1, n - rk - 1).noalias() -=
                s.a.block(rk, j0, 1, k + 1) * s.f.block(k + 1, 0, ncols - k - 1, k + 1).transpose();
        if (rk < n - 1) {
            for (int j = rk + 1; j < n; ++j) {
                if (s.vn1[j] == 0.0) continue;
                double ratio = std::abs(s.a(rk, j)) / s.vn1[j];
                ratio = std::max(0.0, (1.0 + ratio) * (1.0 - ratio));
                const double drift = ratio * (s.vn1[j] / s.vn2[j]) * (s.vn1[j] / s.vn2[j]);
                if (drift <= tol3z)
                    stale.push_back(j);
                else
                    s.vn1[j] *= std::sqrt(ratio);
            }
        }
        s.a(rk, rk) = akk;
        ++k;
    }
    const int rk = j0 + k;
    if (rk < n)
        s.a.block(rk, rk, n - rk, n - rk).noalias() -=
            s.a.block(rk, j0, n - rk, k) * s.f.block(k, 0, ncols - k, k).transpose();
    for (const int j : stale) {
        s.vn1[j] = rk < n ? s.a.col(j).tail(n - rk).norm() : 0.0;
        s.vn2[j] = s.vn1[j];
    }
    return k;
}

void Factorise(StridedMap& a, int n, int* jpvt, double* tau) {
    std::vector<double> vn1(n);
    std::vector<double> vn2(n);
    for (int j = 0; j < n; ++j) {
        jpvt[j] = j;
        vn1[j] = a.col(j).norm();
        vn2[j] = vn1[j];
    }
    Eigen::MatrixXd f;
    PanelState state{a, n, jpvt, tau, vn1, vn2, f};
    for (int j = 0; j < n;) j += ReducePanel(state, j);
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
        if (status == DQRLSC_OK) Factorise(a, n, jpvt, qraux);
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
