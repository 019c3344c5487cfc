// Ground to image as the exact inverse of the image-to-ground equations.
//
// The closed form (AxesToImage) solves the equations only approximately: its
// Earth-curvature drop comes from the ground distance, the equations' from
// the image-derived one, so off nadir it misses the model by tenths of a
// pixel. Here the equations are solved for the along- and across-track
// distances directly (a start that is already within millionths of a pixel
// for the general form), then Newton steps on the image position, with the
// derivatives of the start kept (the chord method), take the forward
// projection to the target. Everything works on the image's own axes: the
// rotation of the ground axes is applied once, to the target.
#include <cmath>

#include "inverse_check.h"
#include "srit/srit_internal.h"

namespace lumo {
namespace srit {
namespace {

constexpr int kMaxSteps = 8;
constexpr int kStartSteps = 2;
// A step below this ends the iteration; the next one would be smaller by the
// chord's contraction (parts in a million), so the answer, the position plus
// that last step, is within 1e-9 pixel of the exact solution.
constexpr double kStopPixels = 1e-4;
constexpr double kDerivativeStep = 1e-3;   // pixels, for derivatives by differences
constexpr double kStartLimitPixels = 1e7;  // a start farther out than this is no start

// Values of the model that every step uses, with their divisions done once.
struct Constants {
    const double* P;
    double dfCurvature;  // 1 / 2N, or 0 without the curvature term
    double dfScaleAtZ;   // 1 - 2kZ / 2N
    double dfInvP3, dfInvP6;
    double dfDisplacementRate;  // (P4^2 + 1) / P3: growth of the elevation displacement

    Constants(const ModelTerms& m, double dfZ) : P(m.P) {
        const double dfInvTwoN = 1.0 / m.dfTwoN;
        dfCurvature = m.sSelect.bCurvature ? dfInvTwoN : 0.0;
        dfScaleAtZ = 1.0 - 2.0 * m.ElevationScaleRate() * dfZ * dfInvTwoN;
        dfInvP3 = 1.0 / P[kAcrossScale];
        dfInvP6 = 1.0 / P[kLineSpacing];
        dfDisplacementRate = (P[kAcrossTilt] * P[kAcrossTilt] + 1.0) * dfInvP3;
    }
};

// The start for the forms without lens correction: the equations solved for
// the along- and across-track distances t and u by fixed-point steps on the
// Earth-curvature drop (the only strongly coupling term), the second-order
// terms taken at the previous estimate. Each step shrinks the miss by about
// 2u / 2N times the elevation displacement (a few thousandths), so three
// leave millionths of a pixel; what the start leaves out (the P12 term, the
// per-line shifts, the extra terms of classes 5 and 6) is the Newton steps'
// work. The divisors change by parts in a thousand over the steps and only
// set the pace, so their first-order reciprocals do.
GroundTerms StartOnAxes(const ModelTerms& m, const Constants& c, double dfAcross, double dfAlong,
                        double dfZ, double* pdfXc, double* pdfYc) {
    const double* P = c.P;
    // First guesses: the elevation displacement at the centre added back.
    double t = dfAlong - dfZ * P[kAlongTilt];
    double u = dfAcross + m.dfTiltRatio * dfZ - P[kShear] * t;
    const double dfAlongRate = 1.0 + u * P[kLineAcross];
    const double dfAcrossRate =
        2.0 - (c.dfScaleAtZ - t * P[kShearAcross] - c.dfDisplacementRate * dfZ);
    double H = dfZ;
    for (int nStep = 0; nStep < kStartSteps; ++nStep) {
        H = dfZ - u * u * c.dfCurvature;
        const double dt = (dfAlong - H * P[kAlongTilt] - P[kLineSquare] * t * t -
                           (1.0 - u * P[kLineAcross]) * t) *
                          dfAlongRate;
        u += (dfAcross - (P[kShear] - t * P[kShearAlong]) * t + m.dfTiltRatio * H -
              (c.dfScaleAtZ - t * P[kShearAcross] - c.dfDisplacementRate * H) * u) *
             dfAcrossRate;
        t += dt;
    }
    *pdfXc = -u / (m.dfIfov * (P[kAcrossScale] + P[kAcrossTilt] * u));
    *pdfYc = -t * c.dfInvP6;
    GroundTerms s;
    s.t = t;
    s.u = u;
    s.H = dfZ - u * u * c.dfCurvature;
    s.Z = dfZ;
    if (m.sSelect.bElevationTerm) {
        s.g = ObliquityGain(m, *pdfXc);
        s.K = s.H * s.H * 0.5 * c.dfInvP3 + s.H;
    }
    return s;
}

// Derivatives {dA/dxc, dA/dyc, dB/dxc, dB/dyc} of the axes offsets A, B of
// ImageToAxes at the terms s of (xc, Z), for the forms without lens
// correction (the per-line shifts are constant within a line).
void AxesDerivatives(const ModelTerms& m, const Constants& c, const GroundTerms& s, double xc,
                     double* j) {
    const Selectors& f = m.sSelect;
    const double* P = c.P;
    const double t = s.t, u = s.u, H = s.H;
    const double c2 = m.dfIfov, P4 = P[kAcrossTilt];
    const double dfDen = c2 * P4 * xc + 1.0;
    const double dUdXc = -c2 * P[kAcrossScale] / (dfDen * dfDen);
    const double dTdYc = -P[kLineSpacing];
    const double Hu = -2.0 * u * c.dfCurvature;  // dH/du
    double At = P[kShear] - 2.0 * t * P[kShearAlong] - u * P[kShearAcross];
    double Au = -t * P[kShearAcross] + c.dfScaleAtZ - c.dfDisplacementRate * H -
                (c.dfDisplacementRate * u + m.dfTiltRatio) * Hu;
    double Bt = 1.0 - u * P[kLineAcross];
    double Bu = -P[kLineAcross] * t + P[kAlongTilt] * Hu;
    double dfAcrossByXc = 0.0;  // A's dependence on xc other than through u
    if (f.bCubicClass) {
        At += 2.0 * m.dfAcrossCube * u * t;
        Au += m.dfAcrossCube * t * t;
        Bt += 2.0 * P[kLineSquare] * t + 3.0 * m.dfLineCube * t * t + m.dfElevationLine * H;
        Bu += m.dfElevationLine * t * Hu;
    } else if (!f.bLinear) {
        if (f.bElevationTerm) {
            const double a = c2 * xc, b = a * a + 1.0;
            const double dGdXc = c2 * (P4 - a) / (b * std::sqrt(b) * std::sqrt(P4 * P4 + 1.0));
            Au += P[kElevationAcross] * s.g * (H * c.dfInvP3 + 1.0) * Hu;
            dfAcrossByXc = P[kElevationAcross] * s.K * dGdXc;
        }
        if (f.bRadarLike) Au += 3.0 * m.dfAcrossCube * u * u;
        Bt += 2.0 * P[kLineSquare] * t;
    }
    j[0] = Au * dUdXc + dfAcrossByXc;
    j[1] = At * dTdYc;
    j[2] = Bu * dUdXc;
    j[3] = Bt * dTdYc;
}

// The same by differences, for the lens-corrected form.
void DerivativesByDifferences(const ModelTerms& m, const GroundTerms& s, double xc, double yc,
                              double dfZ, double* j) {
    const GroundTerms sX = ImageToAxes(m, xc + kDerivativeStep, yc, dfZ);
    const GroundTerms sY = ImageToAxes(m, xc, yc + kDerivativeStep, dfZ);
    j[0] = (sX.dfAcross - s.dfAcross) / kDerivativeStep;
    j[1] = (sY.dfAcross - s.dfAcross) / kDerivativeStep;
    j[2] = (sX.dfAlong - s.dfAlong) / kDerivativeStep;
    j[3] = (sY.dfAlong - s.dfAlong) / kDerivativeStep;
}

// Whether the axes miss (rA, rB), taken to the image through the derivatives
// j, lies within the inverse tolerance (false where j is singular).
bool MissWithinTolerance(const double* j, double rA, double rB) {
    const double det = j[0] * j[3] - j[1] * j[2];
    if (!(std::isfinite(det) && det != 0.0)) return false;
    return WithinInverseTolerance((j[3] * rA - j[1] * rB) / det, (j[0] * rB - j[2] * rA) / det);
}

}  // namespace

bool GroundToImageExact(const ModelTerms& m, double dfX, double dfY, double dfZ, double* pdfPixel,
                        double* pdfLine) {
    double dfAcross = 0.0, dfAlong = 0.0;  // the target on the image's axes
    GroundToAxes(m, dfX, dfY, &dfAcross, &dfAlong);
    const Constants c(m, dfZ);
    double xc = 0.0, yc = 0.0, j[4];
    GroundTerms s;
    if (m.sSelect.bLens) {
        double dfPixel = 0.0, dfLine = 0.0;
        AxesToImage(m, dfAcross, dfAlong, dfZ, &dfPixel, &dfLine);
        xc = m.dfCentreColumn - dfPixel;
        yc = dfLine - m.dfCentreLine;
        s = ImageToAxes(m, xc, yc, dfZ);
        DerivativesByDifferences(m, s, xc, yc, dfZ, j);
    } else {
        // The derivatives come from the start's own terms, so they need not
        // wait for its forward projection.
        const GroundTerms sStart = StartOnAxes(m, c, dfAcross, dfAlong, dfZ, &xc, &yc);
        AxesDerivatives(m, c, sStart, xc, j);
        s = ImageToAxes(m, xc, yc, dfZ);
    }
    if (!(std::abs(xc) < kStartLimitPixels && std::abs(yc) < kStartLimitPixels)) return false;
    const double det = j[0] * j[3] - j[1] * j[2];
    if (!(std::isfinite(det) && det != 0.0)) return false;
    const double dfInvDet = 1.0 / det;
    double dxc = 0.0, dyc = 0.0;
    for (int nStep = 0; nStep < kMaxSteps; ++nStep) {
        // The step from the forward projection of (xc, yc): its miss in pixels.
        const double rA = dfAcross - s.dfAcross, rB = dfAlong - s.dfAlong;
        dxc = (j[3] * rA - j[1] * rB) * dfInvDet;
        dyc = (j[0] * rB - j[2] * rA) * dfInvDet;
        if (WithinInverseTolerance(dxc, dyc, kStopPixels) || nStep + 1 == kMaxSteps) break;
        xc += dxc;
        yc += dyc;
        s = ImageToAxes(m, xc, yc, dfZ);
    }
    if (!WithinInverseTolerance(dxc, dyc)) return false;  // the steps did not close
    // The answer is (xc, yc) with its last correction. It counts only when
    // its own forward projection lands within the tolerance, the miss taken
    // to pixels through the derivatives at the answer: the start's
    // derivatives that drove the steps could understate a miss far from the
    // start.
    xc += dxc;
    yc += dyc;
    s = ImageToAxes(m, xc, yc, dfZ);
    if (m.sSelect.bLens) {
        DerivativesByDifferences(m, s, xc, yc, dfZ, j);
    } else {
        AxesDerivatives(m, c, s, xc, j);
    }
    if (!MissWithinTolerance(j, dfAcross - s.dfAcross, dfAlong - s.dfAlong)) return false;
    *pdfPixel = m.dfCentreColumn - xc;
    *pdfLine = m.dfCentreLine + yc;
    return true;
}

}  // namespace srit
}  // namespace lumo
