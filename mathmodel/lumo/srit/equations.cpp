// The rigorous model's equations, written once on ModelTerms: image to
// ground at an elevation (which the adjustment linearises and the transforms
// evaluate), ground to image, the partial derivatives of the adjustment's
// observation rows, and the direction in which a ground position moves with
// the elevation.
#include <algorithm>
#include <cmath>

#include "srit/srit_internal.h"

namespace lumo {
namespace srit {
namespace {

// Truncation toward zero that stays defined for any double.
long long TruncLine(double v) {
    if (!(std::abs(v) < 9e18)) return 0;
    return static_cast<long long>(v);
}

// Entry l (counted from 1) of the per-line table, or null.
const AttitudeLine_t* LineEntry(const ModelTerms& m, long long l) {
    if (m.psLineTable == nullptr || l < 1 || l > m.psLineTable->nNumAttitudeLines) return nullptr;
    return &m.psLineTable->pAttitudeLines[l - 1];
}

// Pixel and line shift of the FORMOSAT panchromatic lens distortion at pixel p.
void LensShift(double p, double* pdfPixelShift, double* pdfLineShift) {
    const double d = p - 6000.0;
    const double r = std::sqrt(d * d + 748225.0);
    const double q = 0.0014496 * r - 6.9536888e-11 * r * r * r;
    *pdfPixelShift = d / r * q;
    *pdfLineShift = 865.0 / r * q;
}

}  // namespace

double AcrossDistance(const ModelTerms& m, double xc) {
    const double c2 = m.dfIfov;
    return -(c2 * xc * m.P[kAcrossScale]) / (c2 * m.P[kAcrossTilt] * xc + 1.0);
}

double ObliquityGain(const ModelTerms& m, double xc) {
    const double c2 = m.dfIfov;
    const double P4 = m.P[kAcrossTilt];
    return (P4 * c2 * xc + 1.0) /
           (std::sqrt((c2 * xc) * (c2 * xc) + 1.0) * std::sqrt(P4 * P4 + 1.0));
}

GroundTerms ImageToAxes(const ModelTerms& m, double xc, double yc, double Z) {
    const double* P = m.P;
    const Selectors& f = m.sSelect;
    if (f.bLens) {
        const double p = m.dfCentreColumn - xc;
        double dfPixelShift = 0.0, dfLineShift = 0.0;
        LensShift(p, &dfPixelShift, &dfLineShift);
        xc = m.dfCentreColumn - (p + dfPixelShift);
        yc += dfLineShift;
    }
    GroundTerms s;
    s.t = -yc * P[kLineSpacing];
    s.u = AcrossDistance(m, xc);
    s.H = f.bCurvature ? Z - s.u * s.u / m.dfTwoN : Z;
    s.Z = Z;
    if (f.bElevationTerm) {
        s.g = ObliquityGain(m, xc);
        s.K = s.H * s.H / (2.0 * P[kAcrossScale]) + s.H;
    }
    const double t = s.t, u = s.u, H = s.H;
    const double F =
        (P[kShear] - t * P[kShearAlong] - u * P[kShearAcross]) * t +
        (1.0 - 2.0 * m.ElevationScaleRate() * Z / m.dfTwoN) * u -
        ((P[kAcrossTilt] * P[kAcrossTilt] + 1.0) / P[kAcrossScale] * u + m.dfTiltRatio) * H;
    const double dfLine = (1.0 - u * P[kLineAcross]) * t + H * P[kAlongTilt];
    double A = F, B = dfLine;
    if (f.bLinear) {
        double s1 = 0.0, s2 = 0.0;
        const long long l = TruncLine(yc + m.dfCentreLine + m.dfLineRounding);
        if (const AttitudeLine_t* psLine = LineEntry(m, l)) {
            s1 = psLine->dfValue2;
            s2 = psLine->dfValue1;
        }
        A = F + s1;
        B = dfLine + s2;
    } else if (f.bCubicClass) {
        A = F + m.dfAcrossCube * u * t * t;
        B = dfLine + P[kLineSquare] * t * t + m.dfLineCube * t * t * t + m.dfElevationLine * H * t;
    } else {
        if (f.bElevationTerm) A = F + s.g * P[kElevationAcross] * s.K;
        if (f.bRadarLike) A += m.dfAcrossCube * u * u * u;
        B = dfLine + P[kLineSquare] * t * t;
    }
    s.dfAcross = A;
    s.dfAlong = B;
    return s;
}

GroundTerms ImageToGround(const ModelTerms& m, double xc, double yc, double Z) {
    GroundTerms s = ImageToAxes(m, xc, yc, Z);
    const double* P = m.P;
    const double ct = std::cos(P[kRotation]), st = std::sin(P[kRotation]);
    s.dfX = P[kCentreX] + s.dfAcross * ct + s.dfAlong * st;
    s.dfY = P[kCentreY] - s.dfAcross * st + s.dfAlong * ct;
    return s;
}

void GroundToImage(const ModelTerms& m, double dfX, double dfY, double dfZ, double* pdfPixel,
                   double* pdfLine) {
    double x = 0.0, y = 0.0;
    GroundToAxes(m, dfX, dfY, &x, &y);
    AxesToImage(m, x, y, dfZ, pdfPixel, pdfLine);
}

void GroundToAxes(const ModelTerms& m, double dfX, double dfY, double* pdfAcross,
                  double* pdfAlong) {
    const double* P = m.P;
    const double s = std::sin(P[kRotation]), co = std::cos(P[kRotation]);
    const double dX = dfX - P[kCentreX], dY = dfY - P[kCentreY];
    *pdfAlong = dY * co + dX * s;
    *pdfAcross = dX * co - dY * s;
}

void AxesToImage(const ModelTerms& m, double x, double y, double dfZ, double* pdfPixel,
                 double* pdfLine) {
    const double* P = m.P;
    const Selectors& f = m.sSelect;
    const double c0 = m.dfTwoN, c2 = m.dfIfov, c6 = m.dfCosAlongTilt;
    const double h = dfZ;
    const double dfScale = 1.0 + 2.0 * m.ElevationScaleRate() * h / c0;
    // Across-track ground position of (x', y') on the image's own axes.
    const auto Across = [&](double xp, double yp) {
        const double E =
            f.bRadarLike ? m.dfAcrossCube * xp * xp * xp : m.dfAcrossCube * xp * yp * yp;
        return (x - P[kShear] * yp) * dfScale + P[kShearAlong] * yp * yp +
               P[kShearAcross] * xp * yp - E;
    };
    const double P3 = P[kAcrossScale], P4 = P[kAcrossTilt];
    const double X1 = Across(x, y);
    const double H = f.bCurvature ? h - x * x / c0 : h;
    const double dfRootP4 = std::sqrt(P4 * P4 + 1.0);
    double Q = 0.0;
    if (f.bElevationTerm) {
        const double r = X1 / P3;
        Q = ((1.0 - P4 * r) / (dfRootP4 * std::sqrt(r * r + 1.0)) * P[kElevationAcross] *
                 (H * H / (2.0 * P3) + H) -
             (X1 + P4 * H / c6)) /
            (P4 * X1 + P3 - H);
    } else {
        Q = -(X1 + P4 * H / c6) / (P4 * X1 + P3 - H);
    }
    const double W = P3 * Q / (P4 * Q + 1.0);
    const double G = H * P[kAlongTilt];
    const double Yc = y - G;
    const double P10 = P[kLineAcross], P11 = P[kLineSquare], P6 = P[kLineSpacing];
    double dfDen = P11 * y + 1.0 + P10 * W;
    if (f.bCubicClass) dfDen += m.dfLineCube * y * y + m.dfElevationLine * H;
    const double tau = Yc / dfDen;
    const double K = (H * H / (2.0 * P3) + H) * P[kElevationAcross] /
                     std::sqrt((c2 * c2 + 1.0) * (P4 * P4 + 1.0));
    double L0 = 0.0;
    if (f.bCubicClass) {
        L0 =
            -(Yc / (P11 * tau + 1.0 + P10 * W + m.dfElevationLine * H + m.dfLineCube * tau * tau)) /
            P6;
    } else if (f.bRadarLike) {
        L0 = -(Yc / (P11 * tau + 1.0 + P10 * W)) / P6;
    } else {
        L0 = (G - y + P10 * tau * W + P11 * tau * tau) / P6;
    }
    if (const AttitudeLine_t* psLine = LineEntry(m, TruncLine(m.dfCentreLine + L0 + 0.5))) {
        L0 += psLine->dfValue1 / P6;
    }
    double dfLine = m.dfCentreLine + L0;
    const double X2 = Across(-W, -L0 * P6);
    const double D = (P4 * X2 + P3 - H - P4 * K) * c2;
    double dfOffset = 0.0;
    const long long l2 = TruncLine(dfLine + 0.5);
    const AttitudeLine_t* psLine2 = l2 <= m.nLines ? LineEntry(m, l2) : nullptr;
    if (psLine2 != nullptr) {
        dfOffset = (psLine2->dfValue2 - (P4 * H / c6 + X2) + K) / D;
    } else {
        dfOffset = (K - (P4 * H / c6 + X2)) / D;
    }
    if (f.bRadarLike) {
        // One refinement of the across-track offset with the line found.
        const double Wr = dfOffset * c2 * P3 / (P4 * c2 * dfOffset + 1.0);
        const double xr = -Wr;
        const double yr = ((y - H * P[kAlongTilt]) / (1.0 - xr * P10 - P6 * L0 * P11) / P6) * P6;
        const double X3 = Across(xr, yr);
        dfOffset = (K - (P4 * H / c6 + X3)) / ((P4 * X3 + P3 - H - P4 * K) * c2);
    }
    double dfPixel = m.dfCentreColumn - dfOffset;
    if (f.bLens) {
        double dfPixelShift = 0.0, dfLineShift = 0.0;
        LensShift(dfPixel, &dfPixelShift, &dfLineShift);
        dfPixel -= dfPixelShift;
        dfLine -= dfLineShift;
    }
    *pdfPixel = dfPixel;
    *pdfLine = dfLine;
}

// Partial derivatives of the ground position by parameter. P3 and P6 are
// relative unknowns: their derivatives are by the relative change.
void ObservationCoefficients(const ModelTerms& m, const GroundTerms& s, bool bXRow,
                             double* pdfCoef) {
    const double* P = m.P;
    const double ct = std::cos(P[kRotation]), st = std::sin(P[kRotation]);
    const double t = s.t, u = s.u, H = s.H;
    double dfP4Term = u * u / P[kAcrossScale] - H / m.dfCosAlongTilt;
    // The curved-incidence scale depends on P4 through c15 = P4 / c6.
    if (m.sSelect.bCurvedIncidence) {
        dfP4Term -= 4.0 * m.dfTiltRatio / m.dfCosAlongTilt * s.Z * u / m.dfTwoN;
    }
    if (bXRow) {
        const double c[kMaxUnknowns] = {1.0,
                                        0.0,
                                        s.dfY - P[kCentreY],
                                        u * ct,
                                        dfP4Term * ct,
                                        t * ct,
                                        (ct * P[kShear] + st) * t,
                                        H * st,
                                        -t * t * ct,
                                        -t * u * ct,
                                        -t * u * st,
                                        t * t * st,
                                        s.g * s.K * ct};
        std::copy(c, c + kMaxUnknowns, pdfCoef);
    } else {
        const double c[kMaxUnknowns] = {0.0,
                                        1.0,
                                        -(s.dfX - P[kCentreX]),
                                        -u * st,
                                        -dfP4Term * st,
                                        -t * st,
                                        (ct - st * P[kShear]) * t,
                                        H * ct,
                                        t * t * st,
                                        t * u * st,
                                        -t * u * ct,
                                        t * t * ct,
                                        -s.g * s.K * st};
        std::copy(c, c + kMaxUnknowns, pdfCoef);
    }
}

void WriteBlock(const Adjustment& sAdj, std::size_t k, const double* pdfCoef, double* pdfRow) {
    const ImageState& sImg = sAdj.asImages[k];
    const int* anPos = sImg.Positions();
    const int nStart = BlockStart(sAdj, k);
    for (int p = 0; p < kMaxUnknowns; ++p) {
        if (anPos[p] < sImg.sSetup.nUnknowns) pdfRow[nStart + anPos[p]] = pdfCoef[p];
    }
}

Displacement DisplacementOf(const ModelTerms& m, double xc) {
    const double* P = m.P;
    const double u = AcrossDistance(m, xc);
    double D = u * m.dfDisplacement + m.dfTiltRatio;
    if (!m.sSelect.bLinear) D -= ObliquityGain(m, xc) * P[kElevationAcross];
    const double ct = std::cos(P[kRotation]), st = std::sin(P[kRotation]);
    return {P[kAlongTilt] * st - D * ct, D * st + P[kAlongTilt] * ct};
}

}  // namespace srit
}  // namespace lumo
