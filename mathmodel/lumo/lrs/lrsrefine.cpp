// Refinement of the orbit model with control points: a sequential Kalman
// filter over the nine refinement values, each control point contributing
// the vector by which its line of sight misses it.
//
// The filter works on the direct state computation with its own copy of the
// refinement values, so the model is read only until the result is stored
// and a state table built earlier cannot hide the perturbations.
#include <algorithm>
#include <cmath>
#include <utility>
#include <vector>

#include "errors.h"
#include "lrs_internal.h"
#include "lumo_rtcs.h"
#include "runtime.h"

namespace lumo::lrs {
namespace {

constexpr int kN = kRefinementSize;
constexpr int kM = 3;

// Initial covariance (diagonal) and differencing steps, in state order.
constexpr double kP0[kN] = {1.9236651206811313e-08, 9.425959091337543e-07,  0.010000000000000002,
                            1.4450949523320563e-12, 1.4450949523320562e-06, 1.4450949523320563e-12,
                            1.4450949523320562e-06, 1.4450949523320563e-12, 1.4450949523320562e-06};
constexpr double kStep[kN] = {1.3869625520110957e-05,
                              1.3869625520110957e-05,
                              0.1,
                              1e-06,
                              0.0001,
                              1e-06,
                              0.0001,
                              1e-06,
                              0.0001};
constexpr double kNoise = 0.0625;  // km^2 on each miss component

using Matrix3 = double[kM][kM];

// Component of ground - satellite perpendicular to the line of sight of
// image point (pixel, line), with refinement values x.
void MissVector(const LRSOrbitModel_t& m, const double* x, const ControlPoint_t& p,
                const double* ground, double* miss) {
    const double t = ImageTime(m.sSensor, p.dfImageX, p.dfImageY);
    const double alpha = ScanAngle(m.sSensor, p.dfImageX);
    double pos[3], R[9], u[3], d[3];
    OrbitStateWith(m, x, t, pos, R);
    const double look[3] = {0.0, std::sin(alpha), std::cos(alpha)};
    MV3_Mult(R, look, u);
    VecNormalize(u);
    VecDiff(ground, pos, d);
    const double along = DotProduct(d, u);
    for (int k = 0; k < 3; ++k) miss[k] = d[k] - along * u[k];
}

// Negative derivative of the miss vector by central differences at x0.
void Jacobian(const LRSOrbitModel_t& m, const double* x0, const ControlPoint_t& p,
              const double* ground, double H[kM][kN]) {
    for (int k = 0; k < kN; ++k) {
        double xPlus[kN], xMinus[kN], mPlus[3], mMinus[3];
        std::copy(x0, x0 + kN, xPlus);
        std::copy(x0, x0 + kN, xMinus);
        xPlus[k] += 0.5 * kStep[k];
        xMinus[k] -= 0.5 * kStep[k];
        MissVector(m, xPlus, p, ground, mPlus);
        MissVector(m, xMinus, p, ground, mMinus);
        for (int i = 0; i < kM; ++i) H[i][k] = (mMinus[i] - mPlus[i]) / kStep[k];
    }
}

// Inverts a 3x3 matrix in place by Gauss-Jordan elimination with full
// pivoting. False (matrix unchanged in meaning) when a pivot is zero.
bool InvertInPlace(Matrix3& a) {
    int anPivotRow[kM], anPivotCol[kM];
    bool abUsed[kM] = {false, false, false};
    for (int step = 0; step < kM; ++step) {
        double dfBig = -1.0;
        int nRow = 0, nCol = 0;
        for (int i = 0; i < kM; ++i) {
            if (abUsed[i]) continue;
            for (int j = 0; j < kM; ++j) {
                if (!abUsed[j] && std::fabs(a[i][j]) > dfBig) {
                    dfBig = std::fabs(a[i][j]);
                    nRow = i;
                    nCol = j;
                }
            }
        }
        abUsed[nCol] = true;
        if (nRow != nCol) std::swap(a[nRow], a[nCol]);
        anPivotRow[step] = nRow;
        anPivotCol[step] = nCol;
        const double dfPivot = a[nCol][nCol];
        if (dfPivot == 0.0 || !std::isfinite(dfPivot)) return false;
        a[nCol][nCol] = 1.0;
        for (double& v : a[nCol]) v /= dfPivot;
        for (int i = 0; i < kM; ++i) {
            if (i == nCol) continue;
            const double dfFactor = a[i][nCol];
            a[i][nCol] = 0.0;
            for (int j = 0; j < kM; ++j) a[i][j] -= a[nCol][j] * dfFactor;
        }
    }
    for (int step = kM - 1; step >= 0; --step) {
        if (anPivotRow[step] == anPivotCol[step]) continue;
        for (auto& row : a) std::swap(row[anPivotRow[step]], row[anPivotCol[step]]);
    }
    return true;
}

// One measurement update of state x and covariance P.
void KalmanUpdate(double* x, double P[kN][kN], const double H[kM][kN], const double* z) {
    double PHt[kN][kM] = {};
    for (int i = 0; i < kN; ++i) {
        for (int j = 0; j < kM; ++j) {
            for (int k = 0; k < kN; ++k) PHt[i][j] += P[i][k] * H[j][k];
        }
    }
    Matrix3 S = {};
    for (int i = 0; i < kM; ++i) {
        for (int j = i; j < kM; ++j) {
            for (int k = 0; k < kN; ++k) S[i][j] += H[i][k] * PHt[k][j];
            if (i == j) S[i][j] += kNoise;
            S[j][i] = S[i][j];
        }
    }
    if (!InvertInPlace(S)) {
        PrintUserMessage(stderr, "Encountered singular matrix in KalmanUpdate.\n");
        return;
    }
    double K[kN][kM] = {};
    for (int i = 0; i < kN; ++i) {
        for (int j = 0; j < kM; ++j) {
            for (int k = 0; k < kM; ++k) K[i][j] += PHt[i][k] * S[k][j];
        }
    }
    for (int i = 0; i < kN; ++i) {
        for (int j = 0; j < kM; ++j) x[i] += K[i][j] * z[j];
    }
    for (int i = 0; i < kN; ++i) {
        for (int j = i; j < kN; ++j) {
            double dfSum = 0.0;
            for (int k = 0; k < kM; ++k) dfSum += K[i][k] * PHt[j][k];
            P[i][j] -= dfSum;
            P[j][i] = P[i][j];
        }
    }
}

void CheckControlPoint(const ControlPoint_t& p, int nIndex) {
    const double adfValues[5] = {p.dfImageX, p.dfImageY, p.dfGroundX, p.dfGroundY, p.dfGroundZ};
    static const char* const apszNames[5] = {"dfImageX", "dfImageY", "dfGroundX", "dfGroundY",
                                             "dfGroundZ"};
    for (int k = 0; k < 5; ++k) {
        const bool bBad =
            !std::isfinite(adfValues[k]) || (k == 3 && std::fabs(adfValues[k]) > 90.0);
        if (bBad) {
            Fatal(Err::kBadArgument,
                  MkName(_("Orbit model refinement: control point %d has %s = %.17g.\n"),
                         nIndex + 1, apszNames[k], adfValues[k]));
        }
    }
}

}  // namespace
}  // namespace lumo::lrs

using namespace lumo::lrs;  // NOLINT(google-build-using-namespace)
using lumo::Err;
using lumo::Fatal;

void LRSRefineOrbitModel(LRSOrbitModel_t* psModel, ControlPoint_t* pasGCPs, int nGCPs) {
    LRSCheckOrbitModel(psModel);
    if (nGCPs < 0 || (nGCPs > 0 && pasGCPs == nullptr)) {
        Fatal(Err::kBadArgument, MkName(_("Orbit model refinement: %d control points at %p.\n"),
                                        nGCPs, static_cast<void*>(pasGCPs)));
    }
    for (int i = 0; i < nGCPs; ++i) CheckControlPoint(pasGCPs[i], i);
    std::vector<ControlPoint_t> asPoints(pasGCPs, pasGCPs + nGCPs);

    double x0[kN], x[kN];
    GetRefinement(*psModel, x0);
    std::copy(x0, x0 + kN, x);
    double P[kN][kN] = {};
    for (int k = 0; k < kN; ++k) P[k][k] = kP0[k];
    for (const ControlPoint_t& p : asPoints) {
        double ground[3], H[kM][kN], z[kM];
        GeodeticToEcr(p.dfGroundX, p.dfGroundY, p.dfGroundZ, ground);
        Jacobian(*psModel, x0, p, ground, H);
        MissVector(*psModel, x, p, ground, z);
        KalmanUpdate(x, P, H, z);
    }
    for (int k = 0; k < kN; ++k) {
        if (!std::isfinite(x[k])) {
            Fatal(Err::kComputation,
                  MkName(_("Orbit model refinement: refinement value %d came out as %.17g; the "
                           "model is left as it was.\n"),
                         k, x[k]));
        }
    }
    SetRefinement(*psModel, x);
    psModel->asControlPoints.swap(asPoints);
}

void LRSRefine(LRSOrbitModel_t* psModel, int nGCPs, double* padfImageX, double* padfImageY,
               double* padfGroundZ, double* padfGroundX, double* padfGroundY) {
    const bool bArrays = padfImageX != nullptr && padfImageY != nullptr && padfGroundZ != nullptr &&
                         padfGroundX != nullptr && padfGroundY != nullptr;
    if (nGCPs < 0 || (nGCPs > 0 && !bArrays)) {
        Fatal(Err::kBadArgument,
              MkName(_("LRSRefine: %d control points without all five arrays.\n"), nGCPs));
    }
    std::vector<ControlPoint_t> asPoints(static_cast<std::size_t>(nGCPs));
    for (int i = 0; i < nGCPs; ++i) {
        asPoints[i] = {padfImageX[i], padfImageY[i], padfGroundX[i], padfGroundY[i],
                       padfGroundZ[i]};
    }
    LRSRefineOrbitModel(psModel, asPoints.data(), nGCPs);
}
