// Radar intersection, parallax and stereo: the ground point of an image
// position at a height, the across-track shift of a point off the reference
// height, the satellite position from two ranged ground points, and the
// height of a point seen in two images.
#include <algorithm>
#include <cmath>

#include "lumo_rtcs.h"
#include "rtcs_earth.h"
#include "rtcs_internal.h"

namespace {

using lumo::rtcs::ClampedAcos;
using lumo::rtcs::kDegToRad;
using lumo::rtcs::kRadToDeg;

// Cosines computed from lengths may stray from [-1, 1] by rounding; a larger
// stray means the lengths describe no triangle.
constexpr double kCosineSlack = 1e-9;

bool AcosChecked(double dfCosine, double* pdfAngle) {
    if (!(std::fabs(dfCosine) <= 1.0 + kCosineSlack)) return false;
    *pdfAngle = ClampedAcos(dfCosine);
    return true;
}

// Solves for a unit direction and returns its latitude and longitude
// (radians).
bool SolveDirection(const double* padfRow0, const double* padfRow1, const double* padfRow2,
                    const double* padfRhs, double* padfDir) {
    int nStatus = -1;
    RTCSSolveEqn(padfRow0, padfRow1, padfRow2, padfRhs, padfDir, &nStatus);
    if (nStatus != 0) return false;
    const double dfLength = lumo::rtcs::Length(padfDir);
    if (!(dfLength > 0.0)) return false;
    for (int k = 0; k < 3; ++k) padfDir[k] /= dfLength;
    return true;
}

// Shift of the parallax from a line's coefficients; negative radicands are
// taken as 0 and a zero range or spacing gives no shift, so the result is
// always finite for finite input.
void ParallaxCore(int nDirection, double dfSpacing, const double* padfInc, const double* padfRng,
                  double dh, double p, double* pdfRange, double* pdfRaised, double* pdfIncidence,
                  double* pdfAngle, double* pdfShift) {
    const double r = padfRng[0] + padfRng[1] * p + padfRng[2] * p * p;
    const double theta = padfInc[0] + padfInc[1] * p + padfInc[2] * p * p;
    const double d = std::sqrt(std::max(0.0, dh * dh + r * r - 2.0 * r * dh * std::cos(theta)));
    const double a = r * std::sin(theta);
    const double dfRadicand = std::max(0.0, a * a + d * d - r * r);
    *pdfRange = r;
    *pdfRaised = d;
    *pdfIncidence = theta;
    *pdfAngle =
        r * d > 0.0 ? theta + ClampedAcos((d * d + r * r - dh * dh) / (2.0 * r * d)) : theta;
    *pdfShift = dfSpacing > 0.0 ? nDirection * (a - std::sqrt(dfRadicand)) / dfSpacing : 0.0;
}

}  // namespace

int RTCSCalGeodetic(const RTCSInfo_t* psModel, double dfPixel, double dfLine, double dfHeight,
                    double* pdfLon, double* pdfLat) {
    if (!lumo::rtcs::IsEvaluable(psModel)) return 0;
    const RTCSCOpt_t& sOpt = *psModel->psCOpt;
    const int nLines = sOpt.sLines.nLines;
    // The height in the model's reference, made ellipsoidal at the position
    // the inverse polynomial gives (the geoid hardly changes over its error).
    double dfLonGuess = 0.0, dfLatGuess = 0.0;
    if (!psModel->sGeoid.adfUndulation.empty() &&
        GCPTransform(&psModel->sGeoInv, dfPixel, dfLine, &dfLonGuess, &dfLatGuess) != 0) {
        return 0;
    }
    const double dh =
        lumo::rtcs::EllipsoidalHeight(*psModel, dfLonGuess, dfLatGuess, dfHeight) - sOpt.dfAvgHt;
    if (!(dfLine >= 0.0) || !(dfLine < nLines) || !std::isfinite(dfPixel) || !std::isfinite(dh)) {
        return 0;
    }
    // 4 * line may round up to 4 * nLines just below the last line.
    const int q = std::min(static_cast<int>(4.0 * dfLine), 4 * nLines - 1);
    const double* c = psModel->padfQStepCoefs + 3 * q;
    if (c[0] == RTCS_FAILED_QUARTER) return 0;

    // Pixels counted from the near end of the quarter line.
    double p = dfPixel;
    if (psModel->padfQRangeFirst[q] > psModel->padfQRangeLast[q]) p = sOpt.sLines.nPixels - p;
    // Angle at the Earth's centre from the near end: the steps of the whole
    // pixels before p (sums of k, k²) and the fraction of the step at p.
    const double n = std::floor(p);
    const double f = p - n;
    const double dfThetaP = c[0] * n + c[1] * n * (n + 1.0) / 2.0 +
                            c[2] * n * (n + 1.0) * (2.0 * n + 1.0) / 6.0 +
                            f * (c[0] + c[1] * p + c[2] * p * p);

    const double* uN = psModel->padfQUnitNear + 3 * q;
    const double* uF = psModel->padfQUnitFar + 3 * q;
    const double* s = psModel->padfQUnitSat + 3 * q;
    const double* S = psModel->padfQSatPos + 3 * q;
    const double dfNearFar = psModel->padfQAngleNearFar[q];
    const double dfFarSat = psModel->padfQAngleFarSat[q];
    const double dfNearSat = dfFarSat - dfNearFar;
    double g[3];
    const double adfRhs1[3] = {std::cos(dfThetaP), std::cos(dfNearFar - dfThetaP),
                               std::cos(dfThetaP + dfNearSat)};
    if (!SolveDirection(uN, uF, s, adfRhs1, g)) return 0;

    // The pixel's point on the reference surface gives its slant range; the
    // point at the requested height with that range lies on the same line.
    const double dfLat0 = std::asin(g[2]);
    const double rho = lumo::rtcs::EarthRadius(dfLat0) + sOpt.dfAvgHt;
    const double T[3] = {rho * g[0], rho * g[1], rho * g[2]};
    const double dfRange = RTCSVectorDistance(S, T);
    const double rhoH = rho + dh;
    const double dfSat = psModel->padfQSatRadius[q];
    double phi = 0.0;
    if (!(rhoH > 0.0) ||
        !AcosChecked((rhoH * rhoH + dfSat * dfSat - dfRange * dfRange) / (2.0 * dfSat * rhoH),
                     &phi)) {
        return 0;
    }
    const double adfRhs2[3] = {std::cos(phi - dfNearSat), std::cos(dfFarSat - phi), std::cos(phi)};
    if (!SolveDirection(uN, uF, s, adfRhs2, g)) return 0;
    *pdfLat = std::asin(g[2]) * kRadToDeg;
    *pdfLon = std::atan2(g[1], g[0]) * kRadToDeg;
    return 1;
}

namespace lumo::rtcs {

bool OwnImageToGround(const RTCSInfo_t* psModel, double dfPixel, double dfLine, double dfHeight,
                      double* pdfLon, double* pdfLat) {
    constexpr int kMaxSteps = 10;
    constexpr double kDelta = 1e-6;           // degrees, for the derivatives
    constexpr double kStepTolerance = 1e-11;  // degrees
    constexpr double kAcceptPixels = 1e-4;
    double lon = 0.0, lat = 0.0;
    if (RTCSCalGeodeticPosition(psModel, dfPixel, dfLine, dfHeight, &lon, &lat) != 1 &&
        GCPTransform(&psModel->sGeoInv, dfPixel, dfLine, &lon, &lat) != 0) {
        return false;
    }
    const auto forward = [&](double x, double y, double* p, double* l) {
        return OwnGeometryToImage(psModel, x, y, dfHeight, p, l, nullptr);
    };
    double p = 0.0, l = 0.0;
    for (int nStep = 0; nStep < kMaxSteps; ++nStep) {
        double pX = 0.0, lX = 0.0, pY = 0.0, lY = 0.0;
        if (!forward(lon, lat, &p, &l) || !forward(lon + kDelta, lat, &pX, &lX) ||
            !forward(lon, lat + kDelta, &pY, &lY)) {
            return false;
        }
        const double a = (pX - p) / kDelta, b = (pY - p) / kDelta;
        const double c = (lX - l) / kDelta, d = (lY - l) / kDelta;
        const double det = a * d - b * c;
        if (!(std::fabs(det) > 0.0)) return false;
        const double rp = dfPixel - p, rl = dfLine - l;
        const double dLon = (d * rp - b * rl) / det;
        const double dLat = (a * rl - c * rp) / det;
        lon += dLon;
        lat += dLat;
        if (std::fabs(dLon) < kStepTolerance && std::fabs(dLat) < kStepTolerance) break;
    }
    // Accepted only when it projects back onto the image position asked for.
    if (!forward(lon, lat, &p, &l) || std::fabs(p - dfPixel) > kAcceptPixels ||
        std::fabs(l - dfLine) > kAcceptPixels || std::fabs(lat) > 90.0) {
        return false;
    }
    *pdfLon = std::remainder(lon, 360.0);
    *pdfLat = lat;
    return true;
}

}  // namespace lumo::rtcs

int RTCSCalGeodeticPosition(const RTCSInfo_t* psModel, double dfPixel, double dfLine,
                            double dfHeight, double* pdfLon, double* pdfLat) {
    double dfLon = 0.0, dfLat = 0.0, dfPixel2 = 0.0, dfLine2 = 0.0;
    if (RTCSCalGeodetic(psModel, dfPixel, dfLine, dfHeight, &dfLon, &dfLat) != 1) return 0;
    if (RTCSGeo2Img(psModel, dfLon, dfLat, dfHeight, &dfPixel2, &dfLine2) != 1) return 0;
    return RTCSCalGeodetic(psModel, dfPixel - (dfPixel2 - dfPixel), dfLine - (dfLine2 - dfLine),
                           dfHeight, pdfLon, pdfLat);
}

void calculate_parallax_shift(int nLine, int nDirection, const double* padfSpacing,
                              const double* padfIncidenceCoefs, const double* padfRangeCoefs,
                              double dfDeltaHeight, double dfPixel, double* pdfRange,
                              double* pdfRaisedRange, double* pdfIncidence, double* pdfAngle,
                              double* pdfShift) {
    ParallaxCore(nDirection, padfSpacing[nLine], padfIncidenceCoefs + 3 * nLine,
                 padfRangeCoefs + 3 * nLine, dfDeltaHeight, dfPixel, pdfRange, pdfRaisedRange,
                 pdfIncidence, pdfAngle, pdfShift);
}

void RTCSCalShiftParallax(int /*nLine*/, int nDirection, double dfSpacing,
                          const double* padfIncidenceCoefs, const double* padfRangeCoefs,
                          double dfDeltaHeight, double dfPixel, double& dfShift) {
    double dfRange = 0, dfRaised = 0, dfIncidence = 0, dfAngle = 0;
    ParallaxCore(nDirection, dfSpacing, padfIncidenceCoefs, padfRangeCoefs, dfDeltaHeight, dfPixel,
                 &dfRange, &dfRaised, &dfIncidence, &dfAngle, &dfShift);
}

void RTCSTransform(GEOInfo_t* psGeoFwd, GEOInfo_t* psGeoInv, LinePosition* psLines, int nPixels,
                   double dfAvgHt, double dfX, double dfY, double dfDeltaHeight, double* pdfPixel,
                   double* pdfLine) {
    *pdfPixel = *pdfLine = LUMO_NULL_VALUE;
    if (psLines == nullptr || psLines->nLines < 1 || psLines->padfRangeFirst == nullptr ||
        psLines->padfRangeLast == nullptr || nPixels < 1) {
        return;
    }
    const double dfRangeFirst = psLines->padfRangeFirst[0];
    const double dfRangeLast = psLines->padfRangeLast[0];
    double dfPixel = 0.0, dfLine = 0.0;
    if (lumo::rtcs::TransformFromLongitude(psGeoFwd, dfX, dfY, &dfPixel, &dfLine) != 0) return;
    double adfLat[3], adfLon[3];
    const double adfSample[3] = {1.0, nPixels / 2.0, static_cast<double>(nPixels)};
    for (int k = 0; k < 3; ++k) {
        if (GCPTransform(psGeoInv, adfSample[k], 0.0, &adfLon[k], &adfLat[k]) != 0) return;
    }
    double adfSat[3], adfRadius[3], adfRange[3], adfInc[3], adfX[3], adfY[3], adfZ[3];
    double dfSpacing = 0.0;
    int nStatus = -1;
    RTCSCalParameters(dfRangeFirst, dfRangeLast, dfAvgHt, adfSat, adfLat, adfLon, adfRadius,
                      adfRange, adfInc, adfX, adfY, adfZ, &dfSpacing, nPixels, &nStatus);
    if (nStatus != 0) return;
    double dfShift = 0.0;
    RTCSCalShiftParallax(0, dfRangeLast > dfRangeFirst ? 1 : -1, dfSpacing, adfInc, adfRange,
                         dfDeltaHeight, dfPixel, dfShift);
    *pdfPixel = dfPixel - dfShift;
    *pdfLine = dfLine;
}

bool RTCSSatPositionAtLine(const double* padfPoint1, const double* padfPoint2,
                           const double* padfEll, double* padfSatPos, double* padfSatGeo,
                           double* padfAngles, double* padfUnit1, double* padfUnit2,
                           double* padfNormal) {
    double p1[3], p2[3];
    RTCSGeodetic2XYZ(padfPoint1, padfEll, p1);
    RTCSGeodetic2XYZ(padfPoint2, padfEll, p2);
    const double r1 = padfPoint1[3];
    const double r2 = padfPoint2[3];
    const double d = RTCSVectorDistance(p2, p1);
    const double dfLen1 = RTCSVectorLength(p1);
    const double dfLen2 = RTCSVectorLength(p2);
    const double alpha1 = RTCSInteriorAngle(d, r2, r1);
    const double alpha2 = RTCSInteriorAngle(d, dfLen2, dfLen1);
    const double dfSat = std::sqrt(
        std::max(0.0, dfLen2 * dfLen2 + r2 * r2 - 2.0 * r2 * dfLen2 * std::cos(alpha1 + alpha2)));
    padfAngles[0] = RTCSInteriorAngle(dfSat, dfLen1, r1);
    padfAngles[1] = RTCSInteriorAngle(dfSat, dfLen2, r2);
    double dfLength = 0.0;
    RTCSNormalize(p1, padfUnit1, &dfLength);
    RTCSNormalize(p2, padfUnit2, &dfLength);
    RTCSCrossProduct(padfUnit1, padfUnit2, padfNormal);
    const double adfRhs[3] = {std::cos(padfAngles[0]), std::cos(padfAngles[1]), 0.0};
    double s[3];
    int nStatus = -1;
    RTCSSolveEqn(padfUnit1, padfUnit2, padfNormal, adfRhs, s, &nStatus);
    if (nStatus != 0) {
        for (int k = 0; k < 3; ++k) {
            padfSatPos[k] = 0.0;
            if (padfSatGeo != nullptr) padfSatGeo[k] = 0.0;
        }
        return false;
    }
    for (int k = 0; k < 3; ++k) padfSatPos[k] = dfSat * s[k];
    if (padfSatGeo != nullptr) RTCSXYZ2Geodetic(padfSatPos, padfEll, padfSatGeo);
    return true;
}

void RTCSDetPoint(int nCoefs, const double* padfXCoefs, const double* padfYCoefs,
                  const double* padfZCoefs, double dfPixel, double dfHeightOffset, double& dfLat,
                  double& dfLon, double& dfHeight, double* padfXYZ) {
    const double* coefs[3] = {padfXCoefs, padfYCoefs, padfZCoefs};
    for (int k = 0; k < 3; ++k) {
        double v = 0.0;
        for (int j = nCoefs - 1; j >= 0; --j) v = v * dfPixel + coefs[k][j];
        padfXYZ[k] = v;
    }
    RTCSXYZPolar(padfXYZ, dfHeightOffset, dfLat, dfLon, dfHeight);
    dfLat *= kRadToDeg;
    dfLon *= kRadToDeg;
}

namespace {

// Ground positions of one image point in each model at one height, placed
// exactly on each model's own ground-to-image mapping.
bool PairAtHeight(const RTCSInfo_t* psModel1, const RTCSInfo_t* psModel2, double dfPixel1,
                  double dfLine1, double dfPixel2, double dfLine2, double dfHeight, double* adf1,
                  double* adf2) {
    return lumo::rtcs::OwnImageToGround(psModel1, dfPixel1, dfLine1, dfHeight, &adf1[0],
                                        &adf1[1]) &&
           lumo::rtcs::OwnImageToGround(psModel2, dfPixel2, dfLine2, dfHeight, &adf2[0], &adf2[1]);
}

}  // namespace

int RTCSDetGeo(const RTCSInfo_t* psModel1, const RTCSInfo_t* psModel2, double dfPixel1,
               double dfLine1, double dfPixel2, double dfLine2, double& dfLon, double& dfLat,
               double& dfHeight) {
    dfLon = dfLat = dfHeight = 0.0;
    if (psModel1 == nullptr || psModel2 == nullptr) return 0;
    const double dfLow = psModel1->dfPixelRes > 5.0 ? 0.0 : psModel1->dfMinGcpHeight - 1000.0;
    const double dfHigh = psModel1->dfPixelRes > 5.0 ? 5000.0 : psModel1->dfMinGcpHeight + 1000.0;
    double lo1[2], lo2[2], hi1[2], hi2[2];
    if (!PairAtHeight(psModel1, psModel2, dfPixel1, dfLine1, dfPixel2, dfLine2, dfLow, lo1, lo2) ||
        !PairAtHeight(psModel1, psModel2, dfPixel1, dfLine1, dfPixel2, dfLine2, dfHigh, hi1, hi2)) {
        return 0;
    }
    // Change of the two images' disagreement between the bracket heights;
    // longitudes are differenced across the 180th meridian correctly.
    const auto lonDiff = [](double a, double b) { return std::remainder(a - b, 360.0); };
    const double dLon = lonDiff(hi1[0], hi2[0]) - lonDiff(lo1[0], lo2[0]);
    const double dLat = (hi1[1] - hi2[1]) - (lo1[1] - lo2[1]);
    const double dfNorm2 = dLon * dLon + dLat * dLat;
    if (!(dfNorm2 > 0.0)) return 0;
    // Newton on the height: the disagreement changes by D over the bracket.
    const double dfSpan = dfHigh - dfLow;
    double h = 0.0;
    double step = 0.0;
    bool bConverged = false;
    for (int nPass = 1; nPass <= 10; ++nPass) {
        h += step;
        double p1[2], p2[2];
        if (!PairAtHeight(psModel1, psModel2, dfPixel1, dfLine1, dfPixel2, dfLine2, h, p1, p2)) {
            return 0;
        }
        step = ((p2[1] - p1[1]) * dLat + lonDiff(p2[0], p1[0]) * dLon) * dfSpan / dfNorm2;
        if (std::fabs(step) < 2.0 && nPass < 10) {
            bConverged = true;
            break;
        }
    }
    if (!bConverged) return 0;
    double dfLonOut = 0.0, dfLatOut = 0.0;
    if (!lumo::rtcs::OwnImageToGround(psModel1, dfPixel1, dfLine1, h, &dfLonOut, &dfLatOut)) {
        return 0;
    }
    dfLon = dfLonOut;
    dfLat = dfLatOut;
    dfHeight = h;
    return 1;
}
