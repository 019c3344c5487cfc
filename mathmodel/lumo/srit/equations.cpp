// Equations of the rigorous adjustment in its unknowns P0 ... P12: image to
// ground at an elevation, the partial derivatives of the ground position,
// and the direction in which a ground position moves with the elevation.
#include <algorithm>
#include <cmath>

#include "srit/srit_internal.h"

namespace lumo {
namespace srit {

// Image-to-ground of the adjustment at centred coordinates and elevation.
GroundTerms AdjustmentImageToGround(const ImageState& sImg, double xc, double yc, double Z) {
    const double* P = sImg.P;
    if (sImg.bFormosatPan) {
        // Lens distortion of the FORMOSAT panchromatic camera.
        const double p = sImg.c4 - xc;
        const double d = p - 6000.0;
        const double r = std::sqrt(d * d + 748225.0);
        const double q = r * 0.0014496 - 6.9536888e-11 * r * r * r;
        xc = sImg.c4 - (p + d / r * q);
        yc += 865.0 / r * q;
    }
    GroundTerms s;
    const double c2 = sImg.c2;
    s.t = -yc * P[6];
    s.u = -(c2 * xc * P[3]) / (c2 * P[4] * xc + 1.0);
    s.H = sImg.bFlat ? Z : Z - s.u * s.u / sImg.c0;
    s.g = (P[4] * c2 * xc + 1.0) /
          (std::sqrt((c2 * xc) * (c2 * xc) + 1.0) * std::sqrt(P[4] * P[4] + 1.0));
    s.K = s.H * s.H / (2.0 * P[3]) + s.H;
    const double dfCommon = (P[5] - s.t * P[8] - s.u * P[9]) * s.t +
                            (1.0 - 2.0 * Z / sImg.c0) * s.u -
                            ((P[4] * P[4] + 1.0) / P[3] * s.u + sImg.c15) * s.H;
    double A = 0.0, B = 0.0;
    if (sImg.bLinearGroup) {
        double s1 = 0.0, s2 = 0.0;
        const int l = static_cast<int>(yc + sImg.c10);
        if (sImg.bHasLineArrays && l >= 1 && l <= static_cast<int>(sImg.adfLineA.size())) {
            s1 = sImg.adfLineB[l - 1];
            s2 = sImg.adfLineA[l - 1];
        }
        A = dfCommon + s1;
        B = (1.0 - s.u * P[10]) * s.t + s.H * P[7] + s2;
    } else {
        A = s.g * P[12] * s.K + dfCommon;
        B = (1.0 - s.u * P[10]) * s.t + s.H * P[7] + P[11] * s.t * s.t;
    }
    const double ct = std::cos(P[2]), st = std::sin(P[2]);
    s.dfX = P[0] + A * ct + B * st;
    s.dfY = P[1] - A * st + B * ct;
    return s;
}

// Coefficients of the X row (bXRow) or the Y row, by parameter P0 ... P12.
void ObservationCoefficients(const ImageState& sImg, const GroundTerms& s, bool bXRow,
                             double* pdfCoef) {
    const double* P = sImg.P;
    const double ct = std::cos(P[2]), st = std::sin(P[2]);
    const double t = s.t, u = s.u, H = s.H;
    const double dfP4Term = u * u / P[3] - H / sImg.c6;
    if (bXRow) {
        const double c[kMaxUnknowns] = {
            1.0,           0.0,         s.dfY - P[1],         u * ct,
            dfP4Term * ct, t * ct,      (ct * P[5] + st) * t, H * st,
            -t * t * ct,   -t * u * ct, -t * u * st,          t * t * st,
            s.g * s.K * ct};
        std::copy(c, c + kMaxUnknowns, pdfCoef);
    } else {
        const double c[kMaxUnknowns] = {0.0,
                                        1.0,
                                        -(s.dfX - P[0]),
                                        -u * st,
                                        -dfP4Term * st,
                                        -t * st,
                                        (ct - st * P[5]) * t,
                                        H * ct,
                                        t * t * st,
                                        t * u * st,
                                        -t * u * ct,
                                        t * t * ct,
                                        -s.g * s.K * st};
        std::copy(c, c + kMaxUnknowns, pdfCoef);
    }
}

// Writes image k's coefficients (by parameter) into its block of the row;
// positions beyond the image's unknown count are not written.
void WriteBlock(const Adjustment& sAdj, std::size_t k, const double* pdfCoef, double* pdfRow) {
    const ImageState& sImg = sAdj.asImages[k];
    const int* anPos = sImg.Positions();
    const int nStart = BlockStart(sAdj, k);
    for (int p = 0; p < kMaxUnknowns; ++p) {
        if (anPos[p] < sImg.sSetup.nUnknowns) pdfRow[nStart + anPos[p]] = pdfCoef[p];
    }
}

Displacement DisplacementOf(const ImageState& sImg, double xc) {
    const double* P = sImg.P;
    const double c2 = sImg.c2;
    const double u = -(c2 * xc * P[3]) / (c2 * P[4] * xc + 1.0);
    double D = u * sImg.c9 + sImg.c15;
    if (!sImg.bLinearGroup) {
        const double g = (P[4] * c2 * xc + 1.0) /
                         (std::sqrt((c2 * xc) * (c2 * xc) + 1.0) * std::sqrt(P[4] * P[4] + 1.0));
        D -= g * P[12];
    }
    const double ct = std::cos(P[2]), st = std::sin(P[2]);
    return {P[7] * st - D * ct, D * st + P[7] * ct};
}

}  // namespace srit
}  // namespace lumo
