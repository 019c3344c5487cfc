// Radar geometry primitives: ellipsoid block, geodetic and Cartesian
// conversions, vector helpers, line position interpolation, the 3x3 solver
// and the polynomial through a few points.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <utility>

#include "errors.h"
#include "lumo_rtcs.h"
#include "rtcs_earth.h"

using lumo::rtcs::kDegToRad;
using lumo::rtcs::kRadToDeg;

void RTCSSetEllipsoidParameters(double* padfEll) {
    const double a = padfEll[0];
    const double b = padfEll[1];
    padfEll[2] = a * a;
    padfEll[3] = b * b;
    padfEll[4] = padfEll[2] / padfEll[3];
    padfEll[5] = (a - b) / a;
    padfEll[6] = (2.0 - padfEll[5]) * padfEll[5];
    padfEll[7] = (padfEll[2] - padfEll[3]) / padfEll[3];
}

void RTCSGeodetic2XYZ(const double* padfGeo, const double* padfEll, double* padfXYZ) {
    const double dfLon = padfGeo[0] * kDegToRad;
    const double dfLat = padfGeo[1] * kDegToRad;
    const double h = padfGeo[2];
    const double c = std::cos(dfLat);
    const double s = std::sin(dfLat);
    const double d = padfEll[1] * std::sqrt(c * c * padfEll[4] + s * s);
    padfXYZ[0] = (padfEll[2] / d + h) * c * std::cos(dfLon);
    padfXYZ[1] = (padfEll[2] / d + h) * c * std::sin(dfLon);
    padfXYZ[2] = (padfEll[3] / d + h) * s;
}

void RTCSXYZ2Geodetic(const double* padfXYZ, const double* padfEll, double* padfGeo) {
    const double a = padfEll[0];
    const double b = padfEll[1];
    const double x = padfXYZ[0];
    const double y = padfXYZ[1];
    const double z = padfXYZ[2];
    const double p = std::hypot(x, y);
    // atan2 keeps the auxiliary angle right on the polar axis (p = 0).
    const double theta = std::atan2(z * a, p * b);
    const double st = std::sin(theta);
    const double ct = std::cos(theta);
    const double dfLat =
        std::atan((z + padfEll[7] * b * st * st * st) / (p - padfEll[6] * a * ct * ct * ct));
    const double sl = std::sin(dfLat);
    // p cos(lat) + z sin(lat) - N (1 - e² sin² lat) is the height along the
    // normal; unlike p / cos(lat) - N it stays exact at the poles.
    const double n = a / std::sqrt(1.0 - padfEll[6] * sl * sl);
    padfGeo[0] = std::atan2(y, x) * kRadToDeg;
    padfGeo[1] = dfLat * kRadToDeg;
    padfGeo[2] = p * std::cos(dfLat) + z * sl - n * (1.0 - padfEll[6] * sl * sl);
}

void RTCSPolarXYZ(const double* pdfLat, const double* pdfLon, const double* pdfRadius,
                  double* padfXYZ) {
    lumo::rtcs::SpherePoint(*pdfLat, *pdfLon, *pdfRadius, padfXYZ);
}

void RTCSXYZPolar(const double* padfXYZ, double dfHeightOffset, double& dfLat, double& dfLon,
                  double& dfHeight) {
    const double r = lumo::rtcs::Length(padfXYZ);
    dfLat = r > 0.0 ? std::asin(std::clamp(padfXYZ[2] / r, -1.0, 1.0)) : 0.0;
    dfLon = std::atan2(padfXYZ[1], padfXYZ[0]);
    dfHeight = r - (lumo::rtcs::EarthRadius(dfLat) + dfHeightOffset);
}

double RTCSVectorLength(const double* a) {
    return lumo::rtcs::Length(a);
}

double RTCSVectorDistance(const double* a, const double* b) {
    const double d[3] = {a[0] - b[0], a[1] - b[1], a[2] - b[2]};
    return lumo::rtcs::Length(d);
}

void RTCSNormalize(const double* a, double* pOut, double* pdfLength) {
    const double dfLength = lumo::rtcs::Length(a);
    *pdfLength = dfLength;
    if (dfLength == 0.0) return;
    for (int i = 0; i < 3; ++i) pOut[i] = a[i] / dfLength;
}

void RTCSDotProduct(const double* a, const double* b, double* pdfOut) {
    *pdfOut = lumo::rtcs::Dot(a, b);
}

void RTCSCrossProduct(const double* a, const double* b, double* pOut) {
    const double x = a[1] * b[2] - a[2] * b[1];
    const double y = a[2] * b[0] - a[0] * b[2];
    const double z = a[0] * b[1] - a[1] * b[0];
    pOut[0] = x;
    pOut[1] = y;
    pOut[2] = z;
}

double RTCSInteriorAngle(double a, double b, double c) {
    const double dfDenominator = 2.0 * a * b;
    if (!(dfDenominator > 0.0)) return 0.0;
    return lumo::rtcs::ClampedAcos((a * a + b * b - c * c) / dfDenominator);
}

namespace {

// Geodetic to Earth-centred Cartesian on the ellipsoid with the given axes
// and their squares; the height in the unit of the axes.
void GeodeticToCartesian(double dfLon, double dfLat, double dfHeight, double a, double b, double a2,
                         double b2, double* padfOut) {
    const double phi = dfLat * kDegToRad;
    const double lambda = dfLon * kDegToRad;
    const double h = std::hypot(a * std::cos(phi), b * std::sin(phi));
    const double dfHorizontal = (a2 / h + dfHeight) * std::cos(phi);
    padfOut[0] = dfHorizontal * std::cos(lambda);
    padfOut[1] = dfHorizontal * std::sin(lambda);
    padfOut[2] = (b2 / h + dfHeight) * std::sin(phi);
}

}  // namespace

void GeodeticToEcr(double dfLon, double dfLat, double dfHeight, double* padfEcr) {
    GeodeticToCartesian(dfLon, dfLat, dfHeight * 0.001, 6378.137, 6356.752, 40680631.59076899,
                        40408295.989504, padfEcr);
}

void GeodeticToEcrM(double dfLon, double dfLat, double dfHeight, double* padfEcr) {
    GeodeticToCartesian(dfLon, dfLat, dfHeight, 6378137.0, 6356752.0, 40680631590769.0,
                        40408295989504.0, padfEcr);
}

void RTCSGetPositionInfo(const LinePosition* psLines, int nLines, double dfLine,
                         double* pdfRangeFirst, double* pdfRangeLast, double* padfLat,
                         double* padfLon, int* pnOutside) {
    // A NaN line compares false and so counts as outside.
    const bool bInside = dfLine >= 0.0 && dfLine <= static_cast<double>(nLines);
    const bool bHasLines = psLines != nullptr && nLines > 0 && psLines->padfRangeFirst != nullptr &&
                           psLines->padfRangeLast != nullptr && psLines->padfLatFirst != nullptr &&
                           psLines->padfLatMid != nullptr && psLines->padfLatLast != nullptr &&
                           psLines->padfLonFirst != nullptr && psLines->padfLonMid != nullptr &&
                           psLines->padfLonLast != nullptr;
    *pnOutside = bInside && bHasLines ? 0 : 1;
    for (int k = 0; k < 3; ++k) padfLat[k] = padfLon[k] = 0.0;
    if (*pnOutside != 0) return;

    // Element k belongs to line coordinate k + 1. Lines before the first
    // element and at the last one take a single element, so only elements
    // 0 .. nLines - 1 are read.
    int i = static_cast<int>(dfLine);
    double w0 = i + 1 - dfLine;
    double w1 = 1.0 - w0;
    if (i < 1) {
        i = 1;
        w0 = 1.0;
        w1 = 0.0;
    } else if (i >= nLines) {
        i = nLines;
        w0 = 1.0;
        w1 = 0.0;
    }
    const LinePosition& s = *psLines;
    auto mix = [&](const double* padf) {
        return w0 * padf[i - 1] + (w1 > 1e-6 ? w1 * padf[i] : 0.0);
    };
    // Longitudes are mixed along the shorter way round, so that two lines on
    // either side of the 180th meridian do not average to 0.
    auto mixLon = [&](const double* padf) {
        const double a = padf[i - 1];
        return w1 > 1e-6 ? a + w1 * std::remainder(padf[i] - a, 360.0) : w0 * a;
    };
    *pdfRangeFirst = mix(s.padfRangeFirst);
    *pdfRangeLast = mix(s.padfRangeLast);
    padfLat[0] = mix(s.padfLatFirst);
    padfLat[1] = mix(s.padfLatMid);
    padfLat[2] = mix(s.padfLatLast);
    padfLon[0] = mixLon(s.padfLonFirst);
    padfLon[1] = mixLon(s.padfLonMid);
    padfLon[2] = mixLon(s.padfLonLast);
    for (int k = 0; k < 3; ++k) {
        if (padfLon[k] > 180.0) padfLon[k] -= 360.0;
    }
}

void RTCSSolveEqn(const double* padfRow0, const double* padfRow1, const double* padfRow2,
                  const double* padfRhs, double* padfX, int* pnStatus) {
    double a[3][3];
    const double* rows[3] = {padfRow0, padfRow1, padfRow2};
    for (int r = 0; r < 3; ++r) {
        for (int c = 0; c < 3; ++c) a[r][c] = rows[r][c];
        padfX[r] = padfRhs[r];
    }
    *pnStatus = -1;
    int anUsed[3] = {0, 0, 0};
    for (int nPass = 0; nPass < 3; ++nPass) {
        // Full pivoting: the largest entry among rows and columns not yet
        // used; a later entry of equal size wins.
        double dfBig = -1.0;
        int nRow = -1;
        int nCol = -1;
        for (int r = 0; r < 3; ++r) {
            if (anUsed[r] != 0) continue;
            for (int c = 0; c < 3; ++c) {
                if (anUsed[c] != 0) continue;
                const double dfSize = std::fabs(a[r][c]);
                if (std::isnan(dfSize)) return;
                if (dfSize >= dfBig) {
                    dfBig = dfSize;
                    nRow = r;
                    nCol = c;
                }
            }
        }
        if (nCol < 0) return;
        anUsed[nCol] = 1;
        if (nRow != nCol) {
            std::swap(a[nRow], a[nCol]);
            std::swap(padfX[nRow], padfX[nCol]);
        }
        const double dfPivot = a[nCol][nCol];
        if (dfPivot == 0.0 || !std::isfinite(dfPivot)) return;
        for (int c = 0; c < 3; ++c) a[nCol][c] /= dfPivot;
        padfX[nCol] /= dfPivot;
        for (int r = 0; r < 3; ++r) {
            if (r == nCol) continue;
            const double dfFactor = a[r][nCol];
            for (int c = 0; c < 3; ++c) a[r][c] -= dfFactor * a[nCol][c];
            padfX[r] -= dfFactor * padfX[nCol];
        }
    }
    for (int r = 0; r < 3; ++r) {
        if (!std::isfinite(padfX[r])) return;
    }
    *pnStatus = 0;
}

void RTCSPolyCoef(const double* padfX, const double* padfY, double* padfCoefs, const int* pnPoints,
                  int* pnStatus) {
    constexpr int kMaxPoints = 20;
    const int n = *pnPoints;
    *pnStatus = -1;
    if (n > kMaxPoints) {
        char szText[80];
        std::snprintf(szText, sizeof szText, "Number of Requested Coefficients is Too Large=%d\n",
                      kMaxPoints);
        lumo::PrintUserMessage(stdout, szText);
        return;
    }
    if (n < 2) {
        lumo::PrintUserMessage(stdout, "Insufficient Number of Points Entered to Solve Equation\n");
        return;
    }
    // Coefficients of the master polynomial prod (x - x_k), leading 1 implied.
    double s[kMaxPoints] = {};
    s[n - 1] = -padfX[0];
    for (int k = 1; k < n; ++k) {
        for (int j = n - 1 - k; j <= n - 2; ++j) s[j] -= padfX[k] * s[j + 1];
        s[n - 1] -= padfX[k];
    }
    for (int m = 0; m < n; ++m) padfCoefs[m] = 0.0;
    for (int j = 0; j < n; ++j) {
        // Derivative of the master polynomial at x_j, then synthetic
        // division by (x - x_j).
        double phi = n;
        for (int m = n - 1; m >= 1; --m) phi = m * s[m] + padfX[j] * phi;
        // Repeated abscissae make the derivative vanish: no polynomial
        // passes through such points.
        if (phi == 0.0 || !std::isfinite(phi)) return;
        const double f = padfY[j] / phi;
        double b = 1.0;
        for (int m = n - 1; m >= 0; --m) {
            padfCoefs[m] += b * f;
            b = s[m] + padfX[j] * b;
        }
    }
    for (int m = 0; m < n; ++m) {
        if (!std::isfinite(padfCoefs[m])) return;
    }
    *pnStatus = 0;
}
