// Starting values of the rigorous adjustment from the orbit and viewing
// geometry of each image's segment, the centre offsets from its control
// points, and the constraint weights.
#include <algorithm>
#include <cmath>

#include "errors.h"
#include "runtime.h"
#include "srit/srit_internal.h"

namespace lumo {
namespace srit {
namespace {

[[noreturn]] void ReportBadStart(std::size_t k, const char* pszWhat) {
    lumo::Fatal(lumo::Err::kComputation,
                MkName(_("Image %d: %s; check the segment's orbit and viewing angles.\n"),
                       static_cast<int>(k), pszWhat));
}

}  // namespace

// Starting values of P0 ... P12 from the orbit and viewing geometry, image by
// image, and the constraint weights.
void ComputeStartingValues(Adjustment& sAdj) {
    const double a = sAdj.sEllipsoid.dfSemiMajor;
    const double e2 = sAdj.sEllipsoid.dfEcc2;
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        ImageState& sImg = sAdj.asImages[k];
        const EphemerisSeg_t& sSeg = *sImg.psSeg;
        ModelTerms& m = sImg.sTerms;
        double* P = m.P;
        const double phi = sSeg.dfCentreLatitude;
        const double tv = sSeg.dfViewAngle;
        const double psi = sSeg.dfPitchAngle;
        const double Rs = sSeg.dfOrbitRadius;
        const double inc = sSeg.dfInclination;
        const double ws = sSeg.dfAngularSpeed;
        const double vs = sSeg.dfSatVelocity;
        const double A1 = sImg.adfAttitude[0], A2 = sImg.adfAttitude[1], A3 = sImg.adfAttitude[2];

        const double phiC = std::atan((1.0 - e2) * std::tan(phi));
        const double D = 1.0 - e2 * std::cos(phiC) * std::cos(phiC);
        const double R = a * std::sqrt((1.0 - e2) / D);
        sImg.dfGeocLat = phiC;
        m.dfTwoN = 2.0 * a / std::sqrt(1.0 - e2 * std::sin(phi) * std::sin(phi));
        const double delta = std::atan(e2 * std::sin(phiC) * std::cos(phiC) / D);
        const double beta = std::atan(std::tan(psi) / std::cos(tv));
        const double rho = Rs / R;
        const double alpha =
            std::asin(rho * std::asin(beta) / std::cos(std::asin(rho * std::sin(tv)) - tv)) - beta;
        const double gamma = std::atan(std::tan(tv) * std::cos(alpha) * std::cos(psi));
        const double eps = std::asin(rho * std::sin(gamma) / std::cos(alpha)) - gamma;
        const double q =
            (std::sin(eps) * std::sin(phiC) - std::cos(inc)) / (std::cos(eps) * std::cos(phiC));
        P[kRotation] = std::asin(q);
        const double thetaP = tv + eps - q * delta;
        P[kAcrossTilt] = std::tan(thetaP);
        const double kappa =
            std::asin(rho * std::sin(psi) * std::cos(eps)) - std::cos(P[kRotation]) * delta;
        m.dfCosAlongTilt = std::cos(kappa);
        P[kAlongTilt] = std::tan(kappa);
        m.dfTiltRatio = P[kAcrossTilt] / m.dfCosAlongTilt;
        const double Hs = Rs - std::cos(eps) * R * std::cos(alpha);
        P[kAcrossScale] = sImg.bFlat ? sSeg.dfPixelRes / m.dfIfov
                                     : Hs / (std::cos(tv) * std::cos(thetaP) * std::cos(psi));
        m.dfDisplacement =
            (P[kAcrossTilt] * P[kAcrossTilt] + 1.0) / (P[kAcrossScale] * m.dfCosAlongTilt) +
            2.0 * (m.dfTiltRatio * m.dfTiltRatio + 1.0) / m.dfTwoN;
        const double cosP2 = std::cos(P[kRotation]);
        const double L = std::tan(psi) * A2 +
                         ((vs - ws * R * cosP2 * delta * std::cos(eps)) / Hs) *
                             (2.0 * std::tan(tv) * std::sin(eps) + 1.0) +
                         2.0 * A1 * std::tan(tv);
        const double sRate = (vs - ws * Rs * cosP2 * delta * std::cos(eps)) / R;
        const double V = ((std::sin(psi) / (std::cos(psi + alpha) * std::cos(eps))) * std::cos(tv) /
                              std::cos(thetaP) * sRate +
                          ws * std::cos(eps) + kEarthRate * std::cos(phiC) * q +
                          (A2 - std::tan(tv) * A3) * Hs / R) *
                         R;
        P[kLineSpacing] = sImg.bFlat ? sSeg.dfLineRes : V * sSeg.dfLineInterval;
        P[kShear] =
            sImg.bFlat
                ? 0.0
                : -((std::sin(tv) * std::cos(alpha) / (std::cos(psi + alpha) * std::cos(eps))) /
                        std::cos(thetaP) * sRate -
                    cosP2 * std::cos(phiC) * kEarthRate + (P[kAcrossScale] / R) * A1) *
                      (R / V);
        P[kLineSquare] = 0.0;
        P[kElevationAcross] = 0.0;
        P[kLineAcross] = (ws * std::sin(eps - q * delta) - kEarthRate * std::sin(phiC) - A3 +
                          kEarthRate * cosP2 * P[kAlongTilt] * std::cos(phiC)) /
                         V;
        P[kShearAlong] =
            -(R / (V * V)) * ws * std::cos(eps) *
                (0.5 * ws * std::sin(eps) - kEarthRate * std::sin(phiC)) -
            (P[kShear] / V) * L -
            2.0 * P[kAcrossTilt] * P[kShear] * P[kShear] / (m.dfTwoN * m.dfCosAlongTilt);
        P[kShearAcross] = L / V - P[kShear] * P[kLineAcross] +
                          2.0 * P[kShear] * P[kAcrossTilt] / (m.dfTwoN * m.dfCosAlongTilt);
        for (int i = 2; i < kMaxUnknowns; ++i) {
            if (!std::isfinite(P[i])) ReportBadStart(k, "the starting values are not finite");
        }
        if (P[kAcrossScale] == 0.0 || P[kLineSpacing] == 0.0)
            ReportBadStart(k, "a starting scale is zero");

        // Centre offsets from the image's full control points.
        double dfSumX = 0.0, dfSumY = 0.0;
        int nUsed = 0;
        for (const PointRecord& sPoint : sAdj.asPoints) {
            const PointSlot& sSlot = sPoint.asSlots[k];
            if (sPoint.cType != 'X' || sSlot.nFlag != 1) continue;
            const double xc = sSlot.dfXc;
            const double t = -sSlot.dfYc * P[kLineSpacing];
            const double u = AcrossDistance(m, xc);
            const double H = sPoint.dfZ - u * u / m.dfTwoN;
            const double A0 = P[kShear] * t + u - m.dfTiltRatio * H;
            const double B0 = P[kAlongTilt] * H + t;
            dfSumX += sPoint.dfX - A0 * std::cos(P[kRotation]) - B0 * std::sin(P[kRotation]);
            dfSumY += sPoint.dfY + A0 * std::sin(P[kRotation]) - B0 * std::cos(P[kRotation]);
            ++nUsed;
        }
        if (nUsed == 0) {
            ReportBadStart(k,
                           "no full control point is measured in this image, so its centre "
                           "cannot be placed");
        }
        P[kCentreX] = dfSumX / nUsed;
        P[kCentreY] = dfSumY / nUsed;
        std::copy(P, P + kMaxUnknowns, sImg.adfStart);
        const double w = sImg.sSetup.dfWeightFactor;
        sAdj.sWeights = {1700.0 * w, 1200.0 * w, 1700.0 * w * std::cos(phiC), 5000.0 * w,
                         1700.0 * w};
    }
}

}  // namespace srit
}  // namespace lumo
