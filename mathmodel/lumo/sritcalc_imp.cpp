// Rigorous model: the exported implementation entry points. The
// computations and the level conversion live in srit/; the ground and image
// transforms of a computed record and the residuals are here.
#include <cmath>
#include <cstddef>

#include "errors.h"
#include "lumo_ephemeris.h"
#include "lumo_srit.h"
#include "runtime.h"
#include "srit/srit_internal.h"

namespace {

using lumo::srit::AttitudeTable;
using lumo::srit::kNull;

bool IsLineTableSensor(int nSensor) {
    return nSensor == 0 || nSensor == 1;
}
bool IsLevelSensor(int nSensor) {
    return nSensor == 0 || nSensor == 1 || nSensor == 54 || nSensor == 55 || nSensor == 57;
}

// Entry l (counted from 1) of the segment's per-line table, or null.
const AttitudeLine_t* LineOf(const SRITInfo_t& sModel, long long l) {
    const AttitudeData_t* psTable = AttitudeTable(sModel.psEphemeris);
    if (psTable == nullptr || l < 1 || l > psTable->nNumAttitudeLines) return nullptr;
    return &psTable->pAttitudeLines[l - 1];
}

// Truncation toward zero that stays defined for any double.
long long TruncLine(double v) {
    if (!(std::abs(v) < 9e18)) return 0;
    return static_cast<long long>(v);
}

// Pixel and line shift of the FORMOSAT lens distortion at pixel p.
void LensShift(double p, double* pdfPixelShift, double* pdfLineShift) {
    const double d = p - 6000.0;
    const double r = std::sqrt(d * d + 748225.0);
    const double q = 0.0014496 * r - 6.9536888e-11 * r * r * r;
    *pdfPixelShift = d / r * q;
    *pdfLineShift = 865.0 / r * q;
}

bool Usable(const SRITInfo_t* psModel) {
    return psModel != nullptr && psModel->psEphemeris != nullptr;
}

void SetNull(double* pdfA, double* pdfB) {
    if (pdfA != nullptr) *pdfA = kNull;
    if (pdfB != nullptr) *pdfB = kNull;
}

}  // namespace

// ---------------------------------------------------------------------------
// Level conversion and computation
// ---------------------------------------------------------------------------

void SPOT1ATo1B_imp(const SRITInfo_t* psModel, double* pdfPixel, double* pdfLine) {
    if (psModel != nullptr) lumo::srit::ConvertTo1B(psModel->psEphemeris, pdfPixel, pdfLine);
}

void SPOT1BTo1A_imp(const SRITInfo_t* psModel, double* pdfPixel, double* pdfLine) {
    if (psModel != nullptr) lumo::srit::ConvertTo1A(psModel->psEphemeris, pdfPixel, pdfLine);
}

void SPOT1BTo1AControlPoint_imp(const EphemerisSeg_t* const* papsEphemeris, int nImage,
                                double* pdfPixel, double* pdfLine) {
    if (papsEphemeris == nullptr || nImage < 0) return;
    lumo::srit::ConvertControlPointTo1A(papsEphemeris[nImage], pdfPixel, pdfLine);
}

int SRITCalculate_imp(SRITInfo_t* psModel, bool bImageFirst, EphemerisSeg_t* psEphemeris, int nGCP,
                      const ProjInfo_t* psProjInfo, const double* padfA, const double* padfB,
                      const double* padfZ, const double* padfC, const double* padfD) {
    return lumo::srit::CalculateOne(psModel, bImageFirst, psEphemeris, nGCP, psProjInfo, padfA,
                                    padfB, padfZ, padfC, padfD);
}

// ---------------------------------------------------------------------------
// Ground and image transforms
// ---------------------------------------------------------------------------

void toutin_imp(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ, double* pdfPixel,
                double* pdfLine) {
    if (!Usable(psModel)) {
        SetNull(pdfPixel, pdfLine);
        return;
    }
    const double* c = psModel->adfCoef;
    const int M = psModel->nModelClass;
    const int S = psModel->nSensor;
    const double h = dfZ;
    const double s = std::sin(c[8]), co = std::cos(c[8]);
    const double dX = dfX - c[16], dY = dfY - c[17];
    const double y = dY * co + dX * s;  // along track
    const double x = dX * co - dY * s;  // across track
    const double E = M == 6 ? c[21] * x * x * x : c[21] * x * y * y;
    const double X1 = (x - c[1] * y) * (1.0 + 2.0 * h / c[0]) + c[3] * y * y + c[5] * x * y - E;
    const double H = M == 2 ? h : h - x * x / c[0];
    const double dfRootP4 = std::sqrt(c[14] * c[14] + 1.0);
    double Q = 0.0;
    if (std::abs(c[18]) >= 1e-7) {
        const double r = X1 / c[12];
        Q = ((1.0 - c[14] * r) / (dfRootP4 * std::sqrt(r * r + 1.0)) * c[18] *
                 (H * H / (2.0 * c[12]) + H) -
             (X1 + c[14] * H / c[6])) /
            (c[14] * X1 + c[12] - H);
    } else {
        Q = -(X1 + c[14] * H / c[6]) / (c[14] * X1 + c[12] - H);
    }
    const double W = c[12] * Q / (c[14] * Q + 1.0);
    const double G = H * c[13];
    const double Yc = y - G;
    double dfDen = c[19] * y + 1.0 + c[7] * W;
    if (M == 5) dfDen += c[20] * y * y + c[22] * H;
    const double tau = Yc / dfDen;
    const double K = (H * H / (2.0 * c[12]) + H) * c[18] /
                     std::sqrt((c[2] * c[2] + 1.0) * (c[14] * c[14] + 1.0));
    double L0 = 0.0;
    if (M == 5) {
        L0 = -(Yc / (c[19] * tau + 1.0 + c[7] * W + c[22] * H + c[20] * tau * tau)) / c[11];
    } else if (M == 6) {
        L0 = -(Yc / (c[19] * tau + 1.0 + c[7] * W)) / c[11];
    } else {
        L0 = (G - y + c[7] * tau * W + c[19] * tau * tau) / c[11];
    }
    if (IsLineTableSensor(S)) {
        if (const AttitudeLine_t* psLine = LineOf(*psModel, TruncLine(c[10] + L0 + 0.5))) {
            L0 += psLine->dfValue1 / c[11];
        }
    }
    double dfLine = c[10] + L0;
    const double yp = -L0 * c[11], xp = -W;
    const double E2 = M == 6 ? c[21] * xp * xp * xp : c[21] * xp * yp * yp;
    const double X2 =
        (x - c[1] * yp) * (1.0 + 2.0 * h / c[0]) + c[3] * yp * yp + c[5] * xp * yp - E2;
    const double D = (c[14] * X2 + c[12] - H - c[14] * K) * c[2];
    double P = 0.0;
    const long long l2 = TruncLine(dfLine + 0.5);
    if (IsLineTableSensor(S) && l2 >= 1 && l2 <= psModel->psEphemeris->nNumLines) {
        const AttitudeLine_t* psLine = LineOf(*psModel, l2);
        const double v = psLine != nullptr ? psLine->dfValue2 : 0.0;
        P = (v - (c[14] * H / c[6] + X2) + K) / D;
    } else {
        P = (K - (c[14] * H / c[6] + X2)) / D;
    }
    if (M == 6) {
        const double Wr = P * c[2] * c[12] / (c[14] * c[2] * P + 1.0);
        const double xr = -Wr;
        const double yr =
            ((y - H * c[13]) / (1.0 - xr * c[7] - c[11] * L0 * c[19]) / c[11]) * c[11];
        const double X3 = (x - c[1] * yr) * (1.0 + 2.0 * h / c[0]) + c[3] * yr * yr +
                          c[5] * xr * yr - c[21] * xr * xr * xr;
        P = (K - (c[14] * H / c[6] + X3)) / ((c[14] * X3 + c[12] - H - c[14] * K) * c[2]);
    }
    double dfPixel = c[4] - P;
    if (S == 50) {
        double dfPixelShift = 0.0, dfLineShift = 0.0;
        LensShift(dfPixel, &dfPixelShift, &dfLineShift);
        dfPixel -= dfPixelShift;
        dfLine -= dfLineShift;
    }
    *pdfPixel = dfPixel;
    *pdfLine = dfLine;
}

void toutin_1_imp(const SRITInfo_t* psModel, double dfXc, double dfYc, double dfZ, double* pdfX,
                  double* pdfY) {
    if (!Usable(psModel)) {
        SetNull(pdfX, pdfY);
        return;
    }
    const double* c = psModel->adfCoef;
    const int M = psModel->nModelClass;
    const int S = psModel->nSensor;
    const double h = dfZ;
    double xc = dfXc, yc = dfYc;
    if (S == 50) {
        const double p = c[4] - xc;
        double dfPixelShift = 0.0, dfLineShift = 0.0;
        LensShift(p, &dfPixelShift, &dfLineShift);
        xc = c[4] - (p + dfPixelShift);
        yc += dfLineShift;
    }
    const long long l = TruncLine(yc + c[10] + 0.5);
    const double s = std::sin(c[8]), co = std::cos(c[8]);
    const double t = -yc * c[11];
    const double u = -c[12] * c[2] * xc / (c[14] * c[2] * xc + 1.0);
    const double H = M == 2 ? h : h - u * u / c[0];
    const double F = (c[1] - t * c[3] - u * c[5]) * t + (1.0 - 2.0 * h / c[0]) * u -
                     ((c[14] * c[14] + 1.0) / c[12] * u + c[15]) * H;
    double A = 0.0, B = 0.0;
    if (S == 0 || S == 1 || S == 30 || S == 31) {
        double s1 = 0.0, s2 = 0.0;
        if (IsLineTableSensor(S)) {
            if (const AttitudeLine_t* psLine = LineOf(*psModel, l)) {
                s1 = psLine->dfValue2;
                s2 = psLine->dfValue1;
            }
        }
        A = F + s1;
        B = (1.0 - u * c[7]) * t + H * c[13] + s2;
    } else if (M == 5) {
        A = F + c[21] * u * t * t;
        B = (1.0 - u * c[7]) * t + H * c[13] + c[19] * t * t + c[20] * t * t * t + c[22] * H * t;
    } else {
        if (std::abs(c[18]) >= 1e-7) {
            const double g =
                (c[14] * c[2] * xc + 1.0) /
                (std::sqrt((c[2] * xc) * (c[2] * xc) + 1.0) * std::sqrt(c[14] * c[14] + 1.0));
            A = F + g * c[18] * (H * H / (2.0 * c[12]) + H);
        } else {
            A = F;
        }
        if (M == 6) A += c[21] * u * u * u;
        B = (1.0 - u * c[7]) * t + H * c[13] + c[19] * t * t;
    }
    *pdfX = c[16] + A * co + B * s;
    *pdfY = c[17] - A * s + B * co;
}

void SRITGeo2Img_imp(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ,
                     double* pdfPixel, double* pdfLine) {
    if (!Usable(psModel)) {
        SetNull(pdfPixel, pdfLine);
        return;
    }
    double dfPixel = 0.0, dfLine = 0.0;
    toutin_imp(psModel, dfX, dfY, dfZ, &dfPixel, &dfLine);
    if (psModel->nModelClass == 6) {
        // Radar-like class: refine with the inverse until the ground closes
        // to 10 ground units, at most four rounds.
        for (int nRound = 0; nRound < 4; ++nRound) {
            double dfX2 = 0.0, dfY2 = 0.0;
            toutin_1_imp(psModel, psModel->adfCoef[4] - dfPixel, dfLine - psModel->adfCoef[10], dfZ,
                         &dfX2, &dfY2);
            const double dX = dfX2 - dfX, dY = dfY2 - dfY;
            if (std::abs(dX) < 10.0 && std::abs(dY) < 10.0) {
                *pdfPixel = dfPixel;
                *pdfLine = dfLine;
                return;
            }
            toutin_imp(psModel, dfX - dX, dfY - dY, dfZ, &dfPixel, &dfLine);
        }
    }
    if (IsLevelSensor(psModel->nSensor)) SPOT1ATo1B_imp(psModel, &dfPixel, &dfLine);
    *pdfPixel = dfPixel;
    *pdfLine = dfLine;
}

int SRITImg2Geo_imp(const SRITInfo_t* psModel, double dfPixel, double dfLine, double dfZ,
                    double* pdfX, double* pdfY) {
    if (dfZ == kNull || !Usable(psModel)) {
        SetNull(pdfX, pdfY);
        return 0;
    }
    if (IsLevelSensor(psModel->nSensor) && psModel->psEphemeris->nLevelConvForm > 0) {
        SPOT1BTo1A_imp(psModel, &dfPixel, &dfLine);
    }
    toutin_1_imp(psModel, psModel->adfCoef[4] - dfPixel, dfLine - psModel->adfCoef[10], dfZ, pdfX,
                 pdfY);
    return 1;
}

int SRITImg2GeoDem_imp(const SRITInfo_t* psModel, double dfPixel, double dfLine, double* pdfZ,
                       double* pdfX, double* pdfY) {
    SetNull(pdfX, pdfY);
    if (pdfZ == nullptr) return 0;
    if (*pdfZ == kNull) *pdfZ = 0.0;
    SRITImg2Geo_imp(psModel, dfPixel, dfLine, *pdfZ, pdfX, pdfY);
    return 1;
}

int SRITGeo2ImgExact(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ,
                     double* pdfPixel, double* pdfLine) {
    SetNull(pdfPixel, pdfLine);
    if (!Usable(psModel) || !std::isfinite(dfX) || !std::isfinite(dfY) || !std::isfinite(dfZ) ||
        dfZ == kNull) {
        return 0;
    }
    const double* c = psModel->adfCoef;
    // Newton's method on the image-to-ground equations, in the model's own
    // (level 1A) image geometry, started from the ground-to-image equations.
    double p = 0.0, l = 0.0;
    toutin_imp(psModel, dfX, dfY, dfZ, &p, &l);
    auto Ground = [&](double dfP, double dfL, double* pdfGX, double* pdfGY) {
        toutin_1_imp(psModel, c[4] - dfP, dfL - c[10], dfZ, pdfGX, pdfGY);
    };
    bool bClosed = false;
    for (int nStep = 0; nStep < 30 && !bClosed; ++nStep) {
        if (!std::isfinite(p) || !std::isfinite(l)) return 0;
        double gx = 0.0, gy = 0.0, gxp = 0.0, gyp = 0.0, gxl = 0.0, gyl = 0.0;
        const double d = 1e-3;
        Ground(p, l, &gx, &gy);
        Ground(p + d, l, &gxp, &gyp);
        Ground(p, l + d, &gxl, &gyl);
        const double j11 = (gxp - gx) / d, j21 = (gyp - gy) / d;
        const double j12 = (gxl - gx) / d, j22 = (gyl - gy) / d;
        const double det = j11 * j22 - j12 * j21;
        if (!(std::abs(det) > 0.0) || !std::isfinite(det)) return 0;
        const double rx = dfX - gx, ry = dfY - gy;
        const double dp = (j22 * rx - j12 * ry) / det;
        const double dl = (-j21 * rx + j11 * ry) / det;
        p += dp;
        l += dl;
        bClosed = std::abs(dp) < 1e-9 && std::abs(dl) < 1e-9;
    }
    if (!bClosed) return 0;
    if (IsLevelSensor(psModel->nSensor)) SPOT1ATo1B_imp(psModel, &p, &l);
    *pdfPixel = p;
    *pdfLine = l;
    return 1;
}

// ---------------------------------------------------------------------------
// Residuals
// ---------------------------------------------------------------------------

void SRITRMSError_imp(const SRITInfo_t* psModel, int nGCP, const double* padfX, const double* padfY,
                      const double* padfZ, const double* padfPixel, const double* padfLine,
                      double& dfRmsPixel, double& dfRmsLine) {
    dfRmsPixel = 0.0;
    dfRmsLine = 0.0;
    if (nGCP < 2) return;
    if (psModel == nullptr || padfX == nullptr || padfY == nullptr || padfZ == nullptr ||
        padfPixel == nullptr || padfLine == nullptr) {
        lumo::Fatal(lumo::Err::kComputation, _("SRITRMSError: a null model or point array.\n"));
        return;
    }
    double dfSumPixel = 0.0, dfSumLine = 0.0;
    for (int i = 0; i < nGCP; ++i) {
        double dfPixel = 0.0, dfLine = 0.0;
        SRITGeo2Img_imp(psModel, padfX[i], padfY[i], padfZ[i], &dfPixel, &dfLine);
        dfSumPixel += (dfPixel - padfPixel[i]) * (dfPixel - padfPixel[i]);
        dfSumLine += (dfLine - padfLine[i]) * (dfLine - padfLine[i]);
    }
    dfRmsPixel = std::sqrt(dfSumPixel / nGCP);
    dfRmsLine = std::sqrt(dfSumLine / nGCP);
}
