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
        double* P = sImg.P;
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
        sImg.c0 = 2.0 * a / std::sqrt(1.0 - e2 * std::sin(phi) * std::sin(phi));
        const double delta = std::atan(e2 * std::sin(phiC) * std::cos(phiC) / D);
        const double beta = std::atan(std::tan(psi) / std::cos(tv));
        const double rho = Rs / R;
        const double alpha =
            std::asin(rho * std::asin(beta) / std::cos(std::asin(rho * std::sin(tv)) - tv)) - beta;
        const double gamma = std::atan(std::tan(tv) * std::cos(alpha) * std::cos(psi));
        const double eps = std::asin(rho * std::sin(gamma) / std::cos(alpha)) - gamma;
        const double q =
            (std::sin(eps) * std::sin(phiC) - std::cos(inc)) / (std::cos(eps) * std::cos(phiC));
        P[2] = std::asin(q);
        const double thetaP = tv + eps - q * delta;
        P[4] = std::tan(thetaP);
        const double kappa =
            std::asin(rho * std::sin(psi) * std::cos(eps)) - std::cos(P[2]) * delta;
        sImg.c6 = std::cos(kappa);
        P[7] = std::tan(kappa);
        sImg.c15 = P[4] / sImg.c6;
        const double Hs = Rs - std::cos(eps) * R * std::cos(alpha);
        P[3] = sImg.bFlat ? sSeg.dfPixelRes / sImg.c2
                          : Hs / (std::cos(tv) * std::cos(thetaP) * std::cos(psi));
        sImg.c9 =
            (P[4] * P[4] + 1.0) / (P[3] * sImg.c6) + 2.0 * (sImg.c15 * sImg.c15 + 1.0) / sImg.c0;
        const double cosP2 = std::cos(P[2]);
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
        P[6] = sImg.bFlat ? sSeg.dfLineRes : V * sSeg.dfLineInterval;
        P[5] = sImg.bFlat
                   ? 0.0
                   : -((std::sin(tv) * std::cos(alpha) / (std::cos(psi + alpha) * std::cos(eps))) /
                           std::cos(thetaP) * sRate -
                       cosP2 * std::cos(phiC) * kEarthRate + (P[3] / R) * A1) *
                         (R / V);
        P[11] = 0.0;
        P[12] = 0.0;
        P[10] = (ws * std::sin(eps - q * delta) - kEarthRate * std::sin(phiC) - A3 +
                 kEarthRate * cosP2 * P[7] * std::cos(phiC)) /
                V;
        P[8] = -(R / (V * V)) * ws * std::cos(eps) *
                   (0.5 * ws * std::sin(eps) - kEarthRate * std::sin(phiC)) -
               (P[5] / V) * L - 2.0 * P[4] * P[5] * P[5] / (sImg.c0 * sImg.c6);
        P[9] = L / V - P[5] * P[10] + 2.0 * P[5] * P[4] / (sImg.c0 * sImg.c6);
        for (int i = 2; i < kMaxUnknowns; ++i) {
            if (!std::isfinite(P[i])) ReportBadStart(k, "the starting values are not finite");
        }
        if (P[3] == 0.0 || P[6] == 0.0) ReportBadStart(k, "a starting scale is zero");

        // Centre offsets from the image's full control points.
        double dfSumX = 0.0, dfSumY = 0.0;
        int nUsed = 0;
        for (const PointRecord& sPoint : sAdj.asPoints) {
            const PointSlot& sSlot = sPoint.asSlots[k];
            if (sPoint.cType != 'X' || sSlot.nFlag != 1) continue;
            const double xc = sSlot.dfXc;
            const double t = -sSlot.dfYc * P[6];
            const double u = -(sImg.c2 * xc * P[3]) / (sImg.c2 * P[4] * xc + 1.0);
            const double H = sPoint.dfZ - u * u / sImg.c0;
            const double A0 = P[5] * t + u - sImg.c15 * H;
            const double B0 = P[7] * H + t;
            dfSumX += sPoint.dfX - A0 * std::cos(P[2]) - B0 * std::sin(P[2]);
            dfSumY += sPoint.dfY + A0 * std::sin(P[2]) - B0 * std::cos(P[2]);
            ++nUsed;
        }
        if (nUsed == 0) {
            ReportBadStart(k,
                           "no full control point is measured in this image, so its centre "
                           "cannot be placed");
        }
        P[0] = dfSumX / nUsed;
        P[1] = dfSumY / nUsed;
        std::copy(P, P + kMaxUnknowns, sImg.adfStart);
        const double w = sImg.sSetup.dfWeightFactor;
        sAdj.sWeights = {1700.0 * w, 1200.0 * w, 1700.0 * w * std::cos(phiC), 5000.0 * w,
                         1700.0 * w};
    }
}

}  // namespace srit
}  // namespace lumo
