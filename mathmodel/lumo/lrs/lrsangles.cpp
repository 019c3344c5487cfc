// Sun and satellite angles of the orbit model: satellite zenith and
// azimuth, solar zenith and azimuth (low-precision solar coordinates, good
// to about 0.01 degree) and their relative azimuth, exactly per image point
// or interpolated from grids every 20 pixels and lines.
//
// Azimuths are measured clockwise from north in [0, 360). On the right half
// of the scan the satellite and relative azimuths are stored encoded (less
// and plus 180 degrees) so that the grids stay smooth across nadir, where
// the true satellite azimuth jumps by 180 degrees.
#include <algorithm>
#include <cmath>
#include <memory>

#include "errors.h"
#include "lrs_internal.h"
#include "lumo_rtcs.h"
#include "runtime.h"
#include "timesys.h"

namespace lumo::lrs {
namespace {

constexpr int kGridStep = 20;
constexpr double kSiderealRatio = 1.00273790934;

enum AngleIndex { kSatZenith = 0, kSatAzimuth, kSunZenith, kSunAzimuth, kRelAzimuth };

// Angle in degrees wrapped as the encodings want: 360 is added while it is
// below 0 and taken away while it is above 360.
double WrapDegrees(double dfAngle) {
    if (!std::isfinite(dfAngle)) return dfAngle;
    if (dfAngle > 360.0) {
        dfAngle = std::fmod(dfAngle, 360.0);
        if (dfAngle == 0.0) dfAngle = 360.0;
    } else if (dfAngle < 0.0) {
        dfAngle = std::fmod(dfAngle, 360.0);
        if (dfAngle < 0.0) dfAngle += 360.0;
    }
    return dfAngle + 0.0;  // no negative zero
}

double Clamp1(double x) {
    return std::clamp(x, -1.0, 1.0);
}

// Modified Julian date of model time t.
double ModifiedJulianDate(const LRSOrbitModel_t& m, double t) {
    const nova::tsys::TimeSystemConverter oConverter;
    nova::tsys::Timestamp oJulian, oMjd;
    if (oConverter.CalendarToJulian(m.nEpochYear, 1, 1, 0, 0, 0.0, oJulian) != 0) {
        Fatal(Err::kBadArgument,
              MkName(_("Orbit model: field nEpochYear is %d, not a year the time systems "
                       "convert.\n"),
                     m.nEpochYear));
    }
    oJulian += (t + m.dfEpochSecOfYear + m.dfTimeOrigin) / kSecondsPerDay;
    oConverter.JulianToMjd(oJulian, oMjd);
    return oMjd.ToDouble();
}

// Greenwich mean sidereal time (rad) of a modified Julian date.
double SiderealTime(double dfMjd) {
    const double d0 = std::floor(dfMjd);
    const double T = (d0 - 51544.5) / 36525.0;
    double s = 24110.54841 + 8640184.812866 * T + 0.093104 * T * T - 6.2e-6 * T * T * T +
               (dfMjd - d0) * kSecondsPerDay * kSiderealRatio;
    s -= std::floor(s / kSecondsPerDay) * kSecondsPerDay;
    return s / kSecondsPerDay * kTwoPi;
}

struct SunPosition {
    double dfHourAngle;  // [-pi, pi)
    double dfDeclination;
};

// Low-precision solar coordinates at a modified Julian date, seen from
// longitude dfLon (rad).
SunPosition Sun(double dfMjd, double dfLon) {
    const double n = dfMjd - 51544.5;
    const double L = WrapTwoPi((280.46 + 0.9856474 * n) * kDegToRad);
    const double g = WrapTwoPi((357.528 + 0.9856003 * n) * kDegToRad);
    const double lambda =
        WrapTwoPi(L + (1.915 * std::sin(g) + 0.02 * std::sin(2.0 * g)) * kDegToRad);
    const double eps = (23.439 - 4e-7 * n) * kDegToRad;
    // Right ascension in the quadrant of the ecliptic longitude.
    const double alpha = std::atan2(std::cos(eps) * std::sin(lambda), std::cos(lambda));
    SunPosition sun{};
    sun.dfDeclination = std::asin(Clamp1(std::sin(eps) * std::sin(lambda)));
    sun.dfHourAngle = WrapPi(SiderealTime(dfMjd) + dfLon - alpha);
    return sun;
}

// Azimuth (rad, [0, 2 pi)) of a direction given by its east and north
// components; 0 when it points straight up or down.
double AzimuthOf(double dfEast, double dfNorth) {
    return WrapTwoPi(std::atan2(dfEast, dfNorth));
}

// The five angles (degrees, true azimuths) at ground point G (on the
// ellipsoid, at longitude and latitude in radians) for satellite position S
// and modified Julian date dfMjd.
void TrueAngles(const double* G, double dfLon, double dfLat, const double* S, double dfMjd,
                double* padfOut) {
    double n[3], toSat[3];
    SurfaceNormal(G, n);
    VecDiff(S, G, toSat);
    VecNormalize(toSat);
    padfOut[kSatZenith] = std::acos(Clamp1(DotProduct(n, toSat))) * kRadToDeg;

    const SunPosition sun = Sun(dfMjd, dfLon);
    const double sd = std::sin(sun.dfDeclination), cd = std::cos(sun.dfDeclination);
    const double sp = std::sin(dfLat), cp = std::cos(dfLat);
    const double ch = std::cos(sun.dfHourAngle), sh = std::sin(sun.dfHourAngle);
    padfOut[kSunZenith] = std::acos(Clamp1(cp * cd * ch + sp * sd)) * kRadToDeg;
    // Components of the sun's direction towards east and north: defined at
    // the poles and at the zenith, unlike the arc cosine of the spherical
    // triangle.
    const double dfSunAz = AzimuthOf(-cd * sh, sd * cp - cd * ch * sp);
    padfOut[kSunAzimuth] = dfSunAz * kRadToDeg;

    // Satellite azimuth: direction from G to the sub-satellite point, its
    // side of north taken from the geometry.
    double adfSat[3] = {S[0], S[1], S[2]}, dfSatLon = 0, dfSatLat = 0, dfSatH = 0, sub[3];
    EcrToGeodetic2(adfSat, &dfSatLon, &dfSatLat, &dfSatH);
    GeodeticToEcr(dfSatLon, dfSatLat, 0.0, sub);
    const double pole[3] = {0.0, 0.0, LRS_ELLIPSOID_B};
    double toPole[3], toSub[3], c1[3], c2[3], c12[3];
    VecDiff(pole, G, toPole);
    VecNormalize(toPole);
    VecDiff(sub, G, toSub);
    VecNormalize(toSub);
    CrossProduct(n, toPole, c1);
    VecNormalize(c1);
    CrossProduct(n, toSub, c2);
    VecNormalize(c2);
    CrossProduct(c1, c2, c12);
    const double dfSatAz = WrapTwoPi(std::atan2(-DotProduct(n, c12), DotProduct(c1, c2)));
    padfOut[kSatAzimuth] = dfSatAz * kRadToDeg;
    double dfRel = padfOut[kSatAzimuth] - padfOut[kSunAzimuth];
    if (dfRel < 0.0) dfRel += 360.0;
    padfOut[kRelAzimuth] = dfRel;
}

bool RightHalf(const LRSOrbitModel_t& m, double dfPixel) {
    return dfPixel >= static_cast<double>(m.sSensor.nNumPixels / 2);  // whole pixels
}

// LRSComputeAngles without the model check, for the grid.
void ComputeAngles(const LRSOrbitModel_t& m, double dfPixel, double dfLine, double dfLon,
                   double dfLat, double* padfOut) {
    const double t = ImageTime(m.sSensor, dfPixel, dfLine);
    double S[3], R[9], G[3];
    GetEcrOrbitState(&m, t, S, R);
    GeodeticToEcr(dfLon, dfLat, 0.0, G);
    TrueAngles(G, dfLon * kDegToRad, dfLat * kDegToRad, S, ModifiedJulianDate(m, t), padfOut);
    if (RightHalf(m, dfPixel)) {
        padfOut[kSatAzimuth] = LRSEncodeSatAzimuthAngle(padfOut[kSatAzimuth]);
        padfOut[kRelAzimuth] = LRSEncodeRelativeAzimuthAngle(padfOut[kRelAzimuth]);
    }
}

void Store(const double* padfAngles, double* pdfSatZenith, double* pdfSatAzimuth,
           double* pdfSunZenith, double* pdfSunAzimuth, double* pdfRelAzimuth) {
    double* apdfOut[LRS_NUM_ANGLE_GRIDS] = {pdfSatZenith, pdfSatAzimuth, pdfSunZenith,
                                            pdfSunAzimuth, pdfRelAzimuth};
    for (int k = 0; k < LRS_NUM_ANGLE_GRIDS; ++k) {
        if (apdfOut[k] != nullptr) *apdfOut[k] = padfAngles[k];
    }
}

// Cell index and fraction along one grid axis (pixels or lines).
void GridCell(int nIndex, int nCount, int nRemainder, int& nCell, double& dfFraction) {
    nCell = nIndex / kGridStep;
    if (nIndex == nCount - 1 && nRemainder == 0) --nCell;
    const int nWidth =
        (nRemainder != 0 && nIndex >= nCount - nRemainder - 1) ? nRemainder : kGridStep;
    dfFraction = static_cast<double>(nIndex - kGridStep * nCell) / nWidth;
}

int ClampedIndex(double dfCoordinate, int nCount, const char* pszName) {
    if (!std::isfinite(dfCoordinate)) {
        Fatal(Err::kBadArgument, MkName(_("Orbit model angles: %s %.17g is not a finite number.\n"),
                                        pszName, dfCoordinate));
    }
    return static_cast<int>(std::clamp(std::trunc(dfCoordinate), 0.0, nCount - 1.0));
}

}  // namespace
}  // namespace lumo::lrs

using namespace lumo::lrs;  // NOLINT(google-build-using-namespace)
using lumo::Err;
using lumo::Fatal;

double LRSEncodeSatAzimuthAngle(double dfAngle) {
    return WrapDegrees(dfAngle - 180.0);
}
double LRSDecodeRelativeAzimuthAngle(double dfAngle) {
    return LRSEncodeSatAzimuthAngle(dfAngle);
}
double LRSDecodeSatAzimuthAngle(double dfAngle) {
    return WrapDegrees(dfAngle + 180.0);
}
double LRSEncodeRelativeAzimuthAngle(double dfAngle) {
    return LRSDecodeSatAzimuthAngle(dfAngle);
}

void LRSComputeAngles(LRSOrbitModel_t* psModel, double dfPixel, double dfLine, double dfLon,
                      double dfLat, double* pdfSatZenith, double* pdfSatAzimuth,
                      double* pdfSunZenith, double* pdfSunAzimuth, double* pdfRelAzimuth) {
    LRSCheckOrbitModel(psModel);
    const double adfIn[4] = {dfPixel, dfLine, dfLon, dfLat};
    static const char* const apszNames[4] = {"pixel", "line", "longitude", "latitude"};
    for (int k = 0; k < 4; ++k) {
        if (!std::isfinite(adfIn[k]) || (k == 3 && std::fabs(dfLat) > 90.0)) {
            Fatal(Err::kBadArgument, MkName(_("Orbit model angles: %s %.17g is out of range.\n"),
                                            apszNames[k], adfIn[k]));
        }
    }
    double adfAngles[LRS_NUM_ANGLE_GRIDS];
    ComputeAngles(*psModel, dfPixel, dfLine, dfLon, dfLat, adfAngles);
    Store(adfAngles, pdfSatZenith, pdfSatAzimuth, pdfSunZenith, pdfSunAzimuth, pdfRelAzimuth);
}

void LRSSetupOrbitModelForAngleGeneration(LRSOrbitModel_t* psModel) {
    LRSCheckOrbitModel(psModel);
    LRSOrbitModel_t& m = *psModel;
    const int nPixels = m.sSensor.nNumPixels, nLines = m.nNumScanLines;
    if (nPixels < 2 || nLines < 2) {
        Fatal(Err::kBadArgument,
              MkName(_("Orbit model angles: the image has %d pixels and %d scan lines "
                       "(nNumScanLines); the grids need at least 2 of each.\n"),
                     nPixels, nLines));
    }
    const int nCols = (nPixels - 2) / kGridStep + 2;
    const int nRows = (nLines - 2) / kGridStep + 2;
    const std::size_t nNodes = static_cast<std::size_t>(nCols) * static_cast<std::size_t>(nRows);
    std::unique_ptr<double, nova::FreeDeleter> apGrids[LRS_NUM_ANGLE_GRIDS];
    for (auto& pGrid : apGrids) pGrid.reset(static_cast<double*>(HMalloc(nNodes * sizeof(double))));
    for (int j = 0; j < nRows; ++j) {
        const double dfLine = std::min(kGridStep * j, nLines - 1) + 0.5;
        for (int i = 0; i < nCols; ++i) {
            const double dfPixel = std::min(kGridStep * i, nPixels - 1) + 0.5;
            double G[3], adfAngles[LRS_NUM_ANGLE_GRIDS];
            ImageToEcr(psModel, dfPixel, dfLine, G);
            const double dfLon = std::atan2(G[1], G[0]) * kRadToDeg;
            const double dfLat =
                std::atan2(G[2] / kEllB2, std::hypot(G[0], G[1]) / kEllA2) * kRadToDeg;
            ComputeAngles(m, dfPixel, dfLine, dfLon, dfLat, adfAngles);
            const std::size_t nNode = static_cast<std::size_t>(nCols) * j + i;
            for (int k = 0; k < LRS_NUM_ANGLE_GRIDS; ++k) apGrids[k].get()[nNode] = adfAngles[k];
        }
    }
    // Grids held from an earlier call go only now that the new ones exist.
    for (int k = 0; k < LRS_NUM_ANGLE_GRIDS; ++k) {
        std::free(m.apadfAngleGrids[k]);
        m.apadfAngleGrids[k] = apGrids[k].release();
    }
    m.nGridColStep = m.nGridRowStep = kGridStep;
    m.nGridCols = nCols;
    m.nGridRows = nRows;
    m.nGridColRemainder = (nPixels - 1) % kGridStep;
    m.nGridRowRemainder = (nLines - 1) % kGridStep;
}

void LRSComputeInterpolatedAngles(LRSOrbitModel_t* psModel, double dfPixel, double dfLine,
                                  double* pdfSatZenith, double* pdfSatAzimuth, double* pdfSunZenith,
                                  double* pdfSunAzimuth, double* pdfRelAzimuth, int nDecode,
                                  double* padfScale, double* padfOffset) {
    const LRSOrbitModel_t& m = *psModel;
    double* apdfOut[LRS_NUM_ANGLE_GRIDS] = {pdfSatZenith, pdfSatAzimuth, pdfSunZenith,
                                            pdfSunAzimuth, pdfRelAzimuth};
    for (int k = 0; k < LRS_NUM_ANGLE_GRIDS; ++k) {
        if (apdfOut[k] != nullptr && m.apadfAngleGrids[k] == nullptr) {
            Fatal(Err::kBadArgument,
                  _("Orbit model angles: the model holds no angle grids; build them with "
                    "LRSSetupOrbitModelForAngleGeneration.\n"));
        }
    }
    const int nPixels = m.sSensor.nNumPixels, nLines = m.nNumScanLines;
    const bool bGridFits = nPixels >= 2 && nLines >= 2 &&
                           m.nGridCols == (nPixels - 2) / kGridStep + 2 &&
                           m.nGridRows == (nLines - 2) / kGridStep + 2 &&
                           m.nGridColRemainder == (nPixels - 1) % kGridStep &&
                           m.nGridRowRemainder == (nLines - 1) % kGridStep;
    if (!bGridFits) {
        Fatal(Err::kBadArgument,
              MkName(_("Orbit model angles: grids of %d x %d nodes do not fit an image of %d "
                       "pixels and %d scan lines.\n"),
                     m.nGridCols, m.nGridRows, nPixels, nLines));
    }
    const int ix = ClampedIndex(dfPixel, nPixels, "pixel");
    const int iy = ClampedIndex(dfLine, nLines, "line");
    int c = 0, r = 0;
    double fx = 0.0, fy = 0.0;
    GridCell(ix, nPixels, m.nGridColRemainder, c, fx);
    GridCell(iy, nLines, m.nGridRowRemainder, r, fy);
    const std::size_t n00 = static_cast<std::size_t>(m.nGridCols) * r + c;
    const std::size_t n01 = n00 + static_cast<std::size_t>(m.nGridCols);
    const bool bDecode = nDecode != 0 && ix >= nPixels / 2;
    const bool bRescale = padfScale != nullptr && padfOffset != nullptr;
    for (int k = 0; k < LRS_NUM_ANGLE_GRIDS; ++k) {
        if (apdfOut[k] == nullptr) continue;
        const double* g = m.apadfAngleGrids[k];
        double v = ((1.0 - fx) * g[n00] + fx * g[n00 + 1]) * (1.0 - fy) +
                   ((1.0 - fx) * g[n01] + fx * g[n01 + 1]) * fy;
        if (bDecode && k == kSatAzimuth) v = LRSDecodeSatAzimuthAngle(v);
        if (bDecode && k == kRelAzimuth) v = LRSDecodeRelativeAzimuthAngle(v);
        if (bRescale) v = padfScale[k] * v + padfOffset[k];
        *apdfOut[k] = v;
    }
}
