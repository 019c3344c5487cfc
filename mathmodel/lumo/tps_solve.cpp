// Structured solve of the thin plate spline system
//   [K P; Pᵀ 0] [w; a] = [v; 0].
// With the QR factorisation P = Q [R; 0] = [Q1 Q2] [R; 0], every w = Q2 γ
// meets Pᵀ w = 0, and γ solves the (n - 3)-square system
//   Q2ᵀ K Q2 γ = Q2ᵀ v,
// which is symmetric positive definite for distinct, non-collinear points
// (the kernel r² ln r² is conditionally positive definite of order 2). A
// Cholesky factorisation of it costs n³/3 flops, a quarter of a pivoted QR of
// the whole matrix, and both outputs share it. The affine part follows from
// the first three rows: R a = Q1ᵀ v - Q1ᵀ K Q2 γ. The residual of every
// control point is checked, with refinement steps on the same factors.
#include "tps_solve.h"

#include <cblas.h>
#include <lapack.h>

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <memory>
#include <new>
#include <vector>

namespace lumo {
namespace {

// Below this |R(k,k)| / |R(0,0)| of the affine block the points are taken as
// collinear; below kMinPivotRatio, the smallest over the largest squared
// pivot of the Cholesky factor, the projected system as singular (duplicate
// or nearly coincident points).
constexpr double kMinAffineRatio = 1e-8;
constexpr double kMinPivotRatio = 1e-14;
constexpr int kMaxRefinements = 2;

std::size_t Index(int row, int col, int ld) {
    return static_cast<std::size_t>(col) * static_cast<std::size_t>(ld) +
           static_cast<std::size_t>(row);
}

// An n x n matrix of which only the lower triangle is ever written or read;
// left uninitialised so that its pages are touched once.
std::unique_ptr<double[]> SquareMatrix(int n) {
    return std::unique_ptr<double[]>(new double[static_cast<std::size_t>(n) * n]);
}

// y = K x for the symmetric n x n matrix K held in its lower triangle and
// cols <= 3 columns of x (leading dimensions n). One pass over K by hand:
// these thin products are memory-bound, and the BLAS would start threads for
// them, which costs more than it gains.
void SymmetricTimes(const double* k, int n, const double* x, int ldx, int cols, double* y) {
    std::fill_n(y, static_cast<std::size_t>(n) * cols, 0.0);
    for (int j = 0; j < n; ++j) {
        const double* column = k + Index(0, j, n);
        for (int c = 0; c < cols; ++c) {
            const double* xc = x + Index(0, c, ldx);
            double* yc = y + Index(0, c, n);
            const double xj = xc[j];
            double sum = column[j] * xj;
            for (int i = j + 1; i < n; ++i) {
                yc[i] += column[i] * xj;
                sum += column[i] * xc[i];
            }
            yc[j] += sum;
        }
    }
}

// Working storage of one solve; all matrices column-major, symmetric ones
// held in their lower triangle.
class StructuredSystem {
  public:
    StructuredSystem(int n, const double* xi, const double* eta)
        : n_(n), m_(n - 3), kernel_(SquareMatrix(n)), projected_(SquareMatrix(n)) {
        basis_.resize(static_cast<std::size_t>(n) * 3);
        for (int i = 0; i < n; ++i) {
            basis_[Index(i, 0, n)] = 1.0;
            basis_[Index(i, 1, n)] = xi[i];
            basis_[Index(i, 2, n)] = eta[i];
        }
        points_ = basis_;
        BuildKernel(xi, eta);
    }

    // Factorises; false when the points are degenerate for this path.
    bool Factorise(double* pdfCondition) {
        if (!FactoriseAffine()) return false;
        Project();
        const char lower = 'L';
        const lapack_int m = m_, ld = n_;
        lapack_int info = 0;
        LAPACK_dpotrf(&lower, &m, Radial(), &ld, &info);
        if (info != 0) return false;
        double smallest = std::abs(Radial()[0]);
        double largest = smallest;
        for (int k = 1; k < m_; ++k) {
            const double pivot = std::abs(Radial()[Index(k, k, n_)]);
            smallest = std::min(smallest, pivot);
            largest = std::max(largest, pivot);
        }
        const double ratio = (smallest / largest) * (smallest / largest);
        if (!(ratio >= kMinPivotRatio)) return false;
        *pdfCondition = 1.0 / ratio;  // a lower bound of the condition number
        return true;
    }

    // coef = [a; w] (n + 3 rows, 2 columns, leading dimension n + 3) for the
    // right-hand sides rhs (n rows, 2 columns, leading dimension n).
    void Solve(const double* rhs, double* coef) const {
        const auto nn = static_cast<std::size_t>(n_);
        std::vector<double> c(rhs, rhs + 2 * nn);
        ApplyQ('T', c.data());  // Qᵀ v
        // γ = (L Lᵀ)⁻¹ Q2ᵀ v, column by column: level-2 solves that the BLAS
        // runs without threads.
        const double* factor = projected_.get() + Index(3, 3, n_);
        for (int col = 0; col < 2; ++col) {
            double* gamma = c.data() + Index(3, col, n_);
            cblas_dtrsv(CblasColMajor, CblasLower, CblasNoTrans, CblasNonUnit, m_, factor, n_,
                        gamma, 1);
            cblas_dtrsv(CblasColMajor, CblasLower, CblasTrans, CblasNonUnit, m_, factor, n_, gamma,
                        1);
        }
        // Top rows: Q1ᵀ v - (Q2ᵀ K Q1)ᵀ γ, then back substitution with R.
        cblas_dgemm(CblasColMajor, CblasTrans, CblasNoTrans, 3, 2, m_, -1.0,
                    projected_.get() + Index(3, 0, n_), n_, c.data() + 3, n_, 1.0, c.data(), n_);
        cblas_dtrsm(CblasColMajor, CblasLeft, CblasUpper, CblasNoTrans, CblasNonUnit, 3, 2, 1.0,
                    basis_.data(), n_, c.data(), n_);
        for (int col = 0; col < 2; ++col) {
            double* top = c.data() + Index(0, col, n_);
            std::copy_n(top, 3, coef + Index(0, col, n_ + 3));
            std::fill_n(top, 3, 0.0);
        }
        ApplyQ('N', c.data());  // w = Q [0; γ]
        for (int col = 0; col < 2; ++col)
            std::copy_n(c.data() + Index(0, col, n_), n_, coef + Index(3, col, n_ + 3));
    }

    // residual = K w + P a - v for both columns; returns the largest |entry|.
    double Residual(const double* coef, const double* rhs, double* residual) const {
        SymmetricTimes(kernel_.get(), n_, coef + 3, n_ + 3, 2, residual);
        double worst = 0.0;
        for (int col = 0; col < 2; ++col) {
            const double* a = coef + Index(0, col, n_ + 3);
            double* r = residual + Index(0, col, n_);
            for (int i = 0; i < n_; ++i) {
                r[i] += a[0] - rhs[Index(i, col, n_)] + a[1] * points_[Index(i, 1, n_)] +
                        a[2] * points_[Index(i, 2, n_)];
                worst = std::max(worst, std::abs(r[i]));
            }
        }
        return worst;
    }

  private:
    double* Radial() { return projected_.get() + Index(3, 3, n_); }

    void BuildKernel(const double* xi, const double* eta) {
        for (int j = 0; j < n_; ++j) {
            double* column = kernel_.get() + Index(0, j, n_);
            column[j] = 0.0;
            for (int i = j + 1; i < n_; ++i) {
                const double dx = xi[i] - xi[j];
                const double dy = eta[i] - eta[j];
                const double r2 = dx * dx + dy * dy;
                column[i] = r2 > 0.0 ? r2 * std::log(r2) : 0.0;
            }
        }
    }

    bool FactoriseAffine() {
        const lapack_int n = n_, three = 3;
        lapack_int info = 0;
        double size = 0.0;
        const lapack_int query = -1;
        LAPACK_dgeqrf(&n, &three, basis_.data(), &n, tau_, &size, &query, &info);
        const auto lwork = static_cast<lapack_int>(std::max(size, 3.0));
        std::vector<double> work(static_cast<std::size_t>(lwork));
        LAPACK_dgeqrf(&n, &three, basis_.data(), &n, tau_, work.data(), &lwork, &info);
        if (info != 0) return false;
        const double r00 = std::abs(basis_[0]);
        for (int k = 1; k < 3; ++k)
            if (!(std::abs(basis_[Index(k, k, n_)]) > kMinAffineRatio * r00)) return false;
        return true;
    }

    // projected = Qᵀ K Q in two passes over K. With Q = I - V T Vᵀ (the
    // reflectors of the affine block in compact form), Y = K V and
    // Z = Y T - ½ V Tᵀ (Vᵀ Y) T, it is K - Z Vᵀ - V Zᵀ: a rank-6 update.
    void Project() {
        const auto nn = static_cast<std::size_t>(n_);
        std::vector<double> v(nn * 3, 0.0), y(nn * 3), z(nn * 3);
        for (int k = 0; k < 3; ++k) {
            v[Index(k, k, n_)] = 1.0;
            for (int i = k + 1; i < n_; ++i) v[Index(i, k, n_)] = basis_[Index(i, k, n_)];
        }
        const char forward = 'F', columns = 'C';
        const lapack_int n = n_, three = 3;
        double t[9] = {0.0};
        LAPACK_dlarft(&forward, &columns, &n, &three, v.data(), &n, tau_, t, &three);
        SymmetricTimes(kernel_.get(), n_, v.data(), n_, 3, y.data());
        double w[9], tw[9], twt[9];  // Vᵀ Y, Tᵀ (Vᵀ Y), Tᵀ (Vᵀ Y) T
        cblas_dgemm(CblasColMajor, CblasTrans, CblasNoTrans, 3, 3, n_, 1.0, v.data(), n_, y.data(),
                    n_, 0.0, w, 3);
        cblas_dgemm(CblasColMajor, CblasTrans, CblasNoTrans, 3, 3, 3, 1.0, t, 3, w, 3, 0.0, tw, 3);
        cblas_dgemm(CblasColMajor, CblasNoTrans, CblasNoTrans, 3, 3, 3, 1.0, tw, 3, t, 3, 0.0, twt,
                    3);
        cblas_dgemm(CblasColMajor, CblasNoTrans, CblasNoTrans, n_, 3, 3, 1.0, y.data(), n_, t, 3,
                    0.0, z.data(), n_);
        cblas_dgemm(CblasColMajor, CblasNoTrans, CblasNoTrans, n_, 3, 3, -0.5, v.data(), n_, twt, 3,
                    1.0, z.data(), n_);
        for (int j = 0; j < n_; ++j) {  // lower triangle of K - Z Vᵀ - V Zᵀ
            const double* from = kernel_.get() + Index(0, j, n_);
            double* to = projected_.get() + Index(0, j, n_);
            const double zj[3] = {z[Index(j, 0, n_)], z[Index(j, 1, n_)], z[Index(j, 2, n_)]};
            const double vj[3] = {v[Index(j, 0, n_)], v[Index(j, 1, n_)], v[Index(j, 2, n_)]};
            for (int i = j; i < n_; ++i) {
                double update = 0.0;
                for (int k = 0; k < 3; ++k)
                    update += z[Index(i, k, n_)] * vj[k] + v[Index(i, k, n_)] * zj[k];
                to[i] = from[i] - update;
            }
        }
    }

    // c := Q c (trans 'N') or Qᵀ c (trans 'T') for c of n rows and 2 columns.
    void ApplyQ(char trans, double* c) const {
        const char left = 'L';
        const lapack_int rows = n_, two = 2, three = 3, ld = n_;
        lapack_int info = 0;
        double work[64];
        const lapack_int lwork = 64;
        LAPACK_dormqr(&left, &trans, &rows, &two, &three, basis_.data(), &ld, tau_, c, &ld, work,
                      &lwork, &info);
    }

    int n_;
    int m_;
    std::vector<double> basis_;  // P, then its QR factorisation (n x 3)
    double tau_[3] = {0.0, 0.0, 0.0};
    std::vector<double> points_;           // P itself
    std::unique_ptr<double[]> kernel_;     // K
    std::unique_ptr<double[]> projected_;  // Qᵀ K Q, its trailing block factorised
};

}  // namespace

bool SolveSplineStructured(int n, const double* xi, const double* eta, const double* vx,
                           const double* vy, double residualLimit, double* coefX, double* coefY,
                           double* pdfCondition) {
    if (n < 4) return false;
    try {
        StructuredSystem system(n, xi, eta);
        if (!system.Factorise(pdfCondition)) return false;
        const auto nn = static_cast<std::size_t>(n);
        std::vector<double> rhs(vx, vx + nn);
        rhs.insert(rhs.end(), vy, vy + nn);
        std::vector<double> coef(2 * (nn + 3)), correction(2 * (nn + 3)), residual(2 * nn);
        system.Solve(rhs.data(), coef.data());
        double worst = system.Residual(coef.data(), rhs.data(), residual.data());
        for (int step = 0; step < kMaxRefinements && worst > residualLimit; ++step) {
            system.Solve(residual.data(), correction.data());
            for (std::size_t k = 0; k < coef.size(); ++k) coef[k] -= correction[k];
            worst = system.Residual(coef.data(), rhs.data(), residual.data());
        }
        if (!(worst <= residualLimit)) return false;
        std::copy_n(coef.data(), nn + 3, coefX);
        std::copy_n(coef.data() + nn + 3, nn + 3, coefY);
        return true;
    } catch (const std::bad_alloc&) {
        // Two n x n matrices did not fit: the rank-revealing solve needs one.
        return false;
    }
}

}  // namespace lumo
