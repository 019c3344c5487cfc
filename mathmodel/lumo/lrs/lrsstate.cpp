// Satellite state and attitude of the orbit model: position in the
// Earth-fixed frame and the rotation from the sensor frame to it, computed
// from the mean elements or interpolated from the one-second state table.
#include <algorithm>
#include <cmath>
#include <memory>

#include "errors.h"
#include "lrs_internal.h"
#include "runtime.h"

namespace lumo::lrs {
namespace {

constexpr double kEarthRotationRate = 7.292115833e-5;  // rad/s
// Largest state table the mapping builds: a pass of a day and its margins.
constexpr int kMaxStates = 90000;

// Rotation angle of the Earth about its axis at model time t.
double GreenwichAngle(const LRSOrbitModel_t& m, double t) {
    return (t + m.dfTimeOrigin) * kEarthRotationRate + m.dfGreenwichAngle;
}

void RotateAboutZ(double gamma, const double* in, double* out) {
    const double c = std::cos(gamma), s = std::sin(gamma);
    const double x = in[0], y = in[1];
    out[0] = x * c + y * s;
    out[1] = y * c - x * s;
    out[2] = in[2];
}

// Unit quaternion (w, x, y, z) of AttitudeMatrix(roll, pitch, yaw), that is
// of qz(yaw) qy(pitch) qx(roll).
void EulerQuaternion(const double* padfAngles, double* q) {
    const double cr = std::cos(0.5 * padfAngles[0]), sr = std::sin(0.5 * padfAngles[0]);
    const double cp = std::cos(0.5 * padfAngles[1]), sp = std::sin(0.5 * padfAngles[1]);
    const double cy = std::cos(0.5 * padfAngles[2]), sy = std::sin(0.5 * padfAngles[2]);
    q[0] = cy * cp * cr + sy * sp * sr;
    q[1] = cy * cp * sr - sy * sp * cr;
    q[2] = cy * sp * cr + sy * cp * sr;
    q[3] = sy * cp * cr - cy * sp * sr;
}

void QuaternionMatrix(const double* q, double* R) {
    const double w = q[0], x = q[1], y = q[2], z = q[3];
    R[0] = 1.0 - 2.0 * (y * y + z * z);
    R[1] = 2.0 * (x * y - w * z);
    R[2] = 2.0 * (x * z + w * y);
    R[3] = 2.0 * (x * y + w * z);
    R[4] = 1.0 - 2.0 * (x * x + z * z);
    R[5] = 2.0 * (y * z - w * x);
    R[6] = 2.0 * (x * z - w * y);
    R[7] = 2.0 * (y * z + w * x);
    R[8] = 1.0 - 2.0 * (x * x + y * y);
}

// The rotation a fraction f of the way from entry A's to entry B's, along
// the shortest arc. Interpolating the rotation itself (not its Euler angles)
// keeps its accuracy where the pitch angle nears +-90 degrees, which polar
// orbits reach at every equator crossing.
void InterpolateRotation(const double* padfA, const double* padfB, double f, double* R) {
    double qa[4], qb[4];
    EulerQuaternion(padfA, qa);
    EulerQuaternion(padfB, qb);
    double dot = qa[0] * qb[0] + qa[1] * qb[1] + qa[2] * qb[2] + qa[3] * qb[3];
    const double sign = dot < 0.0 ? -1.0 : 1.0;
    dot = std::min(1.0, std::fabs(dot));
    const double angle = std::acos(dot);
    double wa = 1.0 - f, wb = f;
    if (angle > 1e-6) {
        const double s = std::sin(angle);
        wa = std::sin((1.0 - f) * angle) / s;
        wb = std::sin(f * angle) / s;
    }
    double q[4];
    for (int k = 0; k < 4; ++k) q[k] = wa * qa[k] + wb * sign * qb[k];
    const double n = std::sqrt(q[0] * q[0] + q[1] * q[1] + q[2] * q[2] + q[3] * q[3]);
    for (double& v : q) v /= n;
    QuaternionMatrix(q, R);
}

// Roll, pitch and yaw of R = Rz(yaw) Ry(pitch) Rx(roll).
void EulerAngles(const double* R, double* padfAngles) {
    const double cp = std::hypot(R[0], R[3]);
    padfAngles[1] = std::atan2(-R[6], cp);
    if (cp > 0.0) {
        padfAngles[0] = std::atan2(R[7], R[8]);
        padfAngles[2] = std::atan2(R[3], R[0]);
    } else {
        padfAngles[0] = std::atan2(-R[7], -R[8]);
        padfAngles[2] = std::atan2(-R[3], -R[0]);
    }
}

}  // namespace

void GetRefinement(const LRSOrbitModel_t& m, double* x) {
    const double adfValues[kRefinementSize] = {
        m.adfOrbitCorr[0], m.adfOrbitCorr[1], m.adfOrbitCorr[2], m.adfRollPoly[0], m.adfRollPoly[1],
        m.adfPitchPoly[0], m.adfPitchPoly[1], m.adfYawPoly[0],   m.adfYawPoly[1]};
    std::copy(adfValues, adfValues + kRefinementSize, x);
}

void SetRefinement(LRSOrbitModel_t& m, const double* x) {
    std::copy(x, x + 3, m.adfOrbitCorr);
    std::copy(x + 3, x + 5, m.adfRollPoly);
    std::copy(x + 5, x + 7, m.adfPitchPoly);
    std::copy(x + 7, x + 9, m.adfYawPoly);
}

void OrbitStateWith(const LRSOrbitModel_t& m, const double* x, double dfTime, double* padfPos,
                    double* padfRot) {
    double adfMean[LRS_NUM_ELEMENTS], adfOsc[LRS_NUM_ELEMENTS], adfAux[LRS_NUM_AUX];
    std::copy(m.adfMeanElements, m.adfMeanElements + LRS_NUM_ELEMENTS, adfMean);
    Brolyd(dfTime + m.dfTimeOrigin, adfOsc, adfMean, 2, 1, 1, adfAux);
    // The orbit corrections are polynomials of degree 0 in time.
    adfOsc[LRS_ELEM_NODE] += polyval(x + 0, 0, dfTime);
    adfOsc[LRS_ELEM_MEAN_ANOMALY] += polyval(x + 1, 0, dfTime);
    adfOsc[LRS_ELEM_A] += polyval(x + 2, 0, dfTime);
    double adfEciPos[3], adfEciVel[3], adfVel[3];
    Celem(adfOsc, adfEciPos, adfEciVel);
    EciToEcr(&m, adfEciPos, adfEciVel, dfTime, padfPos, adfVel);
    double adfOrbital[9], adfAttitude[9];
    SatToEcrRotMatrix(padfPos, adfVel, adfOrbital);
    AttitudeMatrix(polyval(x + 3, 1, dfTime), polyval(x + 5, 1, dfTime), polyval(x + 7, 1, dfTime),
                   adfAttitude);
    MM3_Mult(adfOrbital, adfAttitude, padfRot);
}

}  // namespace lumo::lrs

using namespace lumo::lrs;  // NOLINT(google-build-using-namespace)
using lumo::Err;
using lumo::Fatal;

void AttitudeMatrix(double dfRoll, double dfPitch, double dfYaw, double* R) {
    const double cf = std::cos(dfRoll), sf = std::sin(dfRoll);
    const double ct = std::cos(dfPitch), st = std::sin(dfPitch);
    const double cp = std::cos(dfYaw), sp = std::sin(dfYaw);
    R[0] = cp * ct;
    R[1] = cp * st * sf - sp * cf;
    R[2] = cp * st * cf + sp * sf;
    R[3] = sp * ct;
    R[4] = sp * st * sf + cp * cf;
    R[5] = sp * st * cf - cp * sf;
    R[6] = -st;
    R[7] = ct * sf;
    R[8] = ct * cf;
}

void SatToEcrRotMatrix(const double* padfPos, const double* padfVel, double* R) {
    double z[3], y[3], x[3];
    VecScale(-1.0, padfPos, z);
    VecNormalize(z);
    CrossProduct(padfVel, padfPos, y);
    VecNormalize(y);
    CrossProduct(y, z, x);
    for (int k = 0; k < 3; ++k) {
        R[3 * k + 0] = x[k];
        R[3 * k + 1] = y[k];
        R[3 * k + 2] = z[k];
    }
}

void EciToEcr(const LRSOrbitModel_t* psModel, const double* padfEciPos, const double* padfEciVel,
              double dfTime, double* padfEcrPos, double* padfEcrVel) {
    const double gamma = GreenwichAngle(*psModel, dfTime);
    RotateAboutZ(gamma, padfEciPos, padfEcrPos);
    RotateAboutZ(gamma, padfEciVel, padfEcrVel);
}

double UnwrapAngle(double dfAngle) {
    if (dfAngle >= kPi) return dfAngle - kTwoPi;
    if (dfAngle < -kPi) return dfAngle + kTwoPi;
    return dfAngle;
}

void CalcEcrOrbitState(const LRSOrbitModel_t* psModel, double dfTime, double* padfPos,
                       double* padfRot) {
    double adfValues[kRefinementSize];
    GetRefinement(*psModel, adfValues);
    OrbitStateWith(*psModel, adfValues, dfTime, padfPos, padfRot);
}

void LRSSetupCoordinateMapping(LRSOrbitModel_t* psModel) {
    LRSCheckOrbitModel(psModel);
    const int n = psModel->nNumStates;
    if (n < 2 || n > kMaxStates) {
        Fatal(Err::kBadArgument,
              MkName(_("Orbit model: field nNumStates is %d; the state table takes 2 to %d "
                       "entries.\n"),
                     n, kMaxStates));
    }
    if (!(psModel->dfStateInterval > 0.0)) {
        Fatal(Err::kBadArgument, MkName(_("Orbit model: field dfStateInterval is %.17g, not a "
                                          "positive number.\n"),
                                        psModel->dfStateInterval));
    }
    // The new table is complete before the old one goes.
    std::unique_ptr<double, nova::FreeDeleter> pTable(static_cast<double*>(
        HMalloc(static_cast<std::uint64_t>(n) * LRS_STATE_SIZE * sizeof(double))));
    double* padfTable = pTable.get();
    for (int k = 0; k < n; ++k) {
        const double t = k * psModel->dfStateInterval + psModel->dfFirstStateTime;
        double adfRot[9];
        double* padfEntry = padfTable + static_cast<std::size_t>(k) * LRS_STATE_SIZE;
        CalcEcrOrbitState(psModel, t, padfEntry, adfRot);
        EulerAngles(adfRot, padfEntry + 3);
    }
    std::free(psModel->padfStates);
    psModel->padfStates = pTable.release();
    psModel->dfLastStateTime = psModel->dfFirstStateTime + (n - 1) * psModel->dfStateInterval;
}

void GetEcrOrbitState(const LRSOrbitModel_t* psModel, double dfTime, double* padfPos,
                      double* padfRot) {
    const LRSOrbitModel_t& m = *psModel;
    if (!std::isfinite(dfTime)) {
        Fatal(Err::kBadArgument, MkName(_("Orbit model: state asked for at time %.17g s, not a "
                                          "finite number.\n"),
                                        dfTime));
    }
    if (m.padfStates == nullptr) {
        CalcEcrOrbitState(psModel, dfTime, padfPos, padfRot);
        return;
    }
    const double* padfFirst = m.padfStates;
    const double* padfLast =
        m.padfStates + static_cast<std::size_t>(m.nNumStates - 1) * LRS_STATE_SIZE;
    if (dfTime <= m.dfFirstStateTime || dfTime >= m.dfLastStateTime) {
        const double* padfEntry = dfTime <= m.dfFirstStateTime ? padfFirst : padfLast;
        std::copy(padfEntry, padfEntry + 3, padfPos);
        AttitudeMatrix(padfEntry[3], padfEntry[4], padfEntry[5], padfRot);
        return;
    }
    const double u = (dfTime - m.dfFirstStateTime) / m.dfStateInterval;
    const int k = std::clamp(static_cast<int>(u), 0, m.nNumStates - 2);
    const double f = u - k;
    const double* a = m.padfStates + static_cast<std::size_t>(k) * LRS_STATE_SIZE;
    const double* b = a + LRS_STATE_SIZE;
    for (int i = 0; i < 3; ++i) padfPos[i] = (1.0 - f) * a[i] + f * b[i];
    InterpolateRotation(a + 3, b + 3, f, padfRot);
}

void LRSSatelliteXYZ(LRSOrbitModel_t* psModel, double dfPixel, double dfLine, double* padfPos) {
    LRSCheckOrbitModel(psModel);
    double adfRot[9];
    GetEcrOrbitState(psModel, ImageTime(psModel->sSensor, dfPixel, dfLine), padfPos, adfRot);
}

void LRSSatelliteXYZAtTime(LRSOrbitModel_t* psModel, double dfDayOfYear, double* padfPos) {
    LRSCheckOrbitModel(psModel);
    const double t =
        (dfDayOfYear - 1.0) * kSecondsPerDay - psModel->dfEpochSecOfYear - psModel->dfTimeOrigin;
    double adfRot[9];
    GetEcrOrbitState(psModel, t, padfPos, adfRot);
}

void LRSSatelliteLonLatHeight(double* padfPos, double* pdfLon, double* pdfLat, double* pdfHeight) {
    EcrToGeodetic2(padfPos, pdfLon, pdfLat, pdfHeight);
}
