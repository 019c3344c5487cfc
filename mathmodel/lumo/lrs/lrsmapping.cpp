// Image and ground mapping of the orbit model: a line of sight from the
// scanner meets the ellipsoid (image to ground); a ground point is placed
// in the image by finding the time at which it lies in the scan plane
// (ground to image), and that answer is accepted only when it projects back
// onto the point.
#include <algorithm>
#include <cmath>

#include "errors.h"
#include "lrs_internal.h"
#include "lumo_rtcs.h"
#include "runtime.h"

namespace lumo::lrs {
namespace {

constexpr double kA = LRS_ELLIPSOID_A;
constexpr double kB = LRS_ELLIPSOID_B;
constexpr double kE2 = 0.006694478197993062;  // 1 - b^2 / a^2
constexpr double kE2A = 42.69829909031287;    // e^2 a
constexpr double kEp2B = 42.84194212154114;   // (a^2 / b^2 - 1) b
constexpr double kBisectUntil = 60.0;         // seconds
constexpr double kSecantTolerance = 1.2e-6;   // along-track unit-vector component
constexpr int kSecantSteps = 10;
// An answer of the ground-to-image search is accepted when its line of sight
// passes the point within this angle (rad; about 0.01 pixel) ...
constexpr double kAcceptAngle = 1e-5;
// ... and the ellipsoid does not hide the point: the line of sight meets it
// no more than this (km) before reaching the point.
constexpr double kHiddenMargin = 50.0;
constexpr double kFailLine = -10000.0;
constexpr double kHeightTolerance = 1e-7;  // km
constexpr int kHeightSteps = 8;

// First intersection of pos + s dir (s >= 0) with the ellipsoid of axes
// (a, a, b); *pdfS receives s. Returns 0 when the ray misses (then s is that
// of the line's point nearest the centre in the scaled space).
int IntersectEllipsoid(const double* pos, const double* dir, double a, double b, double* out,
                       double* pdfS) {
    const double P[3] = {pos[0] / a, pos[1] / a, pos[2] / b};
    const double D[3] = {dir[0] / a, dir[1] / a, dir[2] / b};
    const double A = DotProduct(D, D);
    const double B = DotProduct(P, D);
    const double C = DotProduct(P, P) - 1.0;
    double Q = B * B - C * A;
    int nHit = 1;
    if (!(A > 0.0)) {
        std::copy(pos, pos + 3, out);
        *pdfS = 0.0;
        return 0;
    }
    if (Q < 0.0) {
        LUMO_TRACE(1, "View vector does not intersect ellipsoid.\n");
        Q = 0.0;
        nHit = 0;
    }
    const double s = (-B - std::sqrt(Q)) / A;
    if (s < 0.0) nHit = 0;  // the ellipsoid lies behind the ray's start
    for (int k = 0; k < 3; ++k) out[k] = pos[k] + s * dir[k];
    *pdfS = s;
    return nHit;
}

// The look vector in ECR and the satellite position of an image point.
void LineOfSight(const LRSOrbitModel_t& m, double dfPixel, double dfLine, double* pos,
                 double* dir) {
    double t = 0.0, look[3], R[9];
    ImageToSensor(&m.sSensor, dfLine, dfPixel, &t, look);
    GetEcrOrbitState(&m, t, pos, R);
    MV3_Mult(R, look, dir);
}

// True when the image point (pixel, line) sees the ground point: its line of
// sight passes the point within kAcceptAngle and no part of the ellipsoid
// lies in front of it.
bool ProjectsOnto(const LRSOrbitModel_t& m, const double* ground, double dfPixel, double dfLine) {
    double pos[3], dir[3], d[3], cross[3];
    LineOfSight(m, dfPixel, dfLine, pos, dir);
    VecDiff(ground, pos, d);
    const double dfRange = VecLength(d);
    CrossProduct(dir, d, cross);
    if (!(DotProduct(dir, d) > 0.0 && VecLength(cross) <= kAcceptAngle * dfRange)) return false;
    double hit[3], s = 0.0;
    VecNormalize(dir);
    if (IntersectEllipsoid(pos, dir, kA, kB, hit, &s) == 0) return true;
    return s >= dfRange - kHiddenMargin;
}

int FailImage(double* pdfPixel, double* pdfLine) {
    *pdfPixel = 0.0;
    *pdfLine = kFailLine;
    return 0;
}

void LonLatOnEllipsoid(const double* g, double* pdfLon, double* pdfLat) {
    *pdfLon = std::atan2(g[1], g[0]) * kRadToDeg;
    *pdfLat = std::atan2(g[2] / kEllB2, std::hypot(g[0], g[1]) / kEllA2) * kRadToDeg;
}

}  // namespace

void SurfaceNormal(const double* padfGround, double* padfNormal) {
    padfNormal[0] = padfGround[0] / kEllA2;
    padfNormal[1] = padfGround[1] / kEllA2;
    padfNormal[2] = padfGround[2] / kEllB2;
    VecNormalize(padfNormal);
}

}  // namespace lumo::lrs

using namespace lumo::lrs;  // NOLINT(google-build-using-namespace)
using lumo::Err;
using lumo::Fatal;

void ImageToSensor(const LRSSensorModel_t* psSensor, double dfLine, double dfPixel, double* pdfTime,
                   double* padfLook) {
    const double alpha = ScanAngle(*psSensor, dfPixel);
    *pdfTime = ImageTime(*psSensor, dfPixel, dfLine);
    padfLook[0] = 0.0;
    padfLook[1] = std::sin(alpha);
    padfLook[2] = std::cos(alpha);
}

double SensorToImage(const LRSSensorModel_t* psSensor, const double* padfLook, double dfTime,
                     double* pdfLine, double* pdfPixel) {
    const LRSSensorModel_t& s = *psSensor;
    const double dfPixel =
        (std::atan2(padfLook[1], padfLook[2]) - s.dfScanAngle0) / s.dfScanAngleStep + s.dfRefPixel;
    *pdfPixel = dfPixel;
    *pdfLine = (dfTime - s.dfTimeOffset -
                ((dfPixel - s.dfRefPixel) * s.dfSampleInterval + s.dfSampleTimeOffset)) /
                   s.dfLineInterval +
               s.dfRefLine;
    const double dfLength = VecLength(padfLook);
    return dfLength > 0.0 ? padfLook[0] / dfLength : 0.0;
}

int EcrIntersection(double* padfPos, double* padfDir, double* padfGround) {
    double s = 0.0;
    return IntersectEllipsoid(padfPos, padfDir, kA, kB, padfGround, &s);
}

int ImageToEcr(LRSOrbitModel_t* psModel, double dfPixel, double dfLine, double* padfGround) {
    double pos[3], dir[3];
    LineOfSight(*psModel, dfPixel, dfLine, pos, dir);
    return EcrIntersection(pos, dir, padfGround);
}

double InversePixelErr(const LRSOrbitModel_t* psModel, const double* padfGround, double dfTime,
                       double* pdfLine, double* pdfPixel) {
    double pos[3], R[9], d[3];
    GetEcrOrbitState(psModel, dfTime, pos, R);
    VecDiff(padfGround, pos, d);
    MtV3_Mult(R, d, d);
    return SensorToImage(&psModel->sSensor, d, dfTime, pdfLine, pdfPixel);
}

int EcrToImage(const LRSOrbitModel_t* psModel, const double* padfGround, double* pdfPixel,
               double* pdfLine) {
    double t0 = psModel->dfFirstStateTime, t1 = psModel->dfLastStateTime;
    if (!(std::isfinite(t0) && std::isfinite(t1) && t1 > t0)) return FailImage(pdfPixel, pdfLine);
    double f0 = InversePixelErr(psModel, padfGround, t0, pdfLine, pdfPixel);
    double f1 = InversePixelErr(psModel, padfGround, t1, pdfLine, pdfPixel);
    if (!(f0 * f1 <= 0.0)) {
        LUMO_TRACE(2, "Ground position is outside of image.\n");
        return FailImage(pdfPixel, pdfLine);
    }
    double f = f1;  // the last error computed
    while (t1 - t0 > kBisectUntil) {
        const double tm = 0.5 * (t0 + t1);
        f = InversePixelErr(psModel, padfGround, tm, pdfLine, pdfPixel);
        if (f * f0 > 0.0) {
            t0 = tm;
            f0 = f;
        } else {
            t1 = tm;
            f1 = f;
        }
    }
    for (int k = 0; k < kSecantSteps && std::fabs(t1 - t0) > 1e-16; ++k) {
        if (std::fabs(f) <= kSecantTolerance || std::fabs(f0 - f1) <= kSecantTolerance) break;
        const double t = f0 / (f0 - f1) * (t1 - t0) + t0;
        f = InversePixelErr(psModel, padfGround, t, pdfLine, pdfPixel);
        if (std::fabs(f0) > std::fabs(f1)) {
            t0 = t;
            f0 = f;
        } else {
            t1 = t;
            f1 = f;
        }
    }
    if (!(std::isfinite(*pdfPixel) && std::isfinite(*pdfLine)) ||
        !ProjectsOnto(*psModel, padfGround, *pdfPixel, *pdfLine)) {
        LUMO_TRACE(2, "Ground position is outside of image.\n");
        return FailImage(pdfPixel, pdfLine);
    }
    return 1;
}

void EcrToGeodetic(const double* padfGround, double* pdfLon, double* pdfLat) {
    LonLatOnEllipsoid(padfGround, pdfLon, pdfLat);
}

void EcrToGeodetic2(double* padfGround, double* pdfLon, double* pdfLat, double* pdfHeight) {
    const double x = padfGround[0], y = padfGround[1], z = padfGround[2];
    const double p = std::hypot(x, y);
    const double beta = std::atan2(z * kA, p * kB);
    const double sb = std::sin(beta), cb = std::cos(beta);
    const double phi = std::atan2(z + kEp2B * sb * sb * sb, p - kE2A * cb * cb * cb);
    const double sp = std::sin(phi);
    *pdfLon = std::atan2(y, x) * kRadToDeg;
    *pdfLat = phi * kRadToDeg;
    // p cos(phi) + z sin(phi) - a sqrt(1 - e^2 sin^2 phi): equal to
    // p / cos(phi) - N but defined at the poles too.
    *pdfHeight = p * std::cos(phi) + z * sp - kA * std::sqrt(1.0 - kE2 * sp * sp);
}

int LRSGeodeticToImage(const LRSOrbitModel_t* psModel, double dfLon, double dfLat, double dfHeight,
                       double* pdfPixel, double* pdfLine) {
    LRSCheckOrbitModel(psModel);
    if (!(std::isfinite(dfLon) && std::isfinite(dfHeight) && std::fabs(dfLat) <= 90.0)) {
        LUMO_TRACE(1, "Ground point (%.17g, %.17g, %.17g) is not a geodetic position.\n", dfLon,
                   dfLat, dfHeight);
        return FailImage(pdfPixel, pdfLine);
    }
    double g[3];
    GeodeticToEcr(dfLon, dfLat, dfHeight, g);
    return EcrToImage(psModel, g, pdfPixel, pdfLine);
}

int LRSImageToGeodetic(LRSOrbitModel_t* psModel, double dfPixel, double dfLine, double* pdfLon,
                       double* pdfLat) {
    LRSCheckOrbitModel(psModel);
    if (!(std::isfinite(dfPixel) && std::isfinite(dfLine))) return 0;
    double g[3];
    const int nHit = ImageToEcr(psModel, dfPixel, dfLine, g);
    LonLatOnEllipsoid(g, pdfLon, pdfLat);
    return nHit;
}

int LRSImageToGeodeticAtHeight(const LRSOrbitModel_t* psModel, double dfPixel, double dfLine,
                               double dfHeight, double* pdfLon, double* pdfLat) {
    LRSCheckOrbitModel(psModel);
    if (!(std::isfinite(dfPixel) && std::isfinite(dfLine) && std::isfinite(dfHeight))) return 0;
    double pos[3], dir[3], g[3], s = 0.0;
    LineOfSight(*psModel, dfPixel, dfLine, pos, dir);
    if (dfHeight == 0.0) {
        const int nHit = IntersectEllipsoid(pos, dir, kA, kB, g, &s);
        LonLatOnEllipsoid(g, pdfLon, pdfLat);
        return nHit;
    }
    // The surface at a height is not an ellipsoid; intersect ellipsoids of
    // raised axes and correct the raise by the height error of the point.
    const double dfTarget = dfHeight * 0.001;
    double dfRaise = dfTarget, dfLon = 0.0, dfLat = 0.0, dfGot = 0.0;
    for (int k = 0; k < kHeightSteps; ++k) {
        if (!(kB + dfRaise > 0.0) ||
            IntersectEllipsoid(pos, dir, kA + dfRaise, kB + dfRaise, g, &s) == 0) {
            return 0;
        }
        EcrToGeodetic2(g, &dfLon, &dfLat, &dfGot);
        if (std::fabs(dfGot - dfTarget) <= kHeightTolerance) break;
        dfRaise += dfTarget - dfGot;
    }
    if (!(std::fabs(dfGot - dfTarget) <= kHeightTolerance)) return 0;
    *pdfLon = dfLon;
    *pdfLat = dfLat;
    return 1;
}

void LRSScanAngleAndTime(LRSOrbitModel_t* psModel, double dfPixel, double dfLine,
                         double* pdfScanAngle, double* pdfTime, int* pnYear) {
    const LRSSensorModel_t& s = psModel->sSensor;
    *pdfScanAngle = ScanAngle(s, dfPixel) * kRadToDeg;
    *pdfTime = ImageTime(s, dfPixel, dfLine) + psModel->dfTimeOrigin + psModel->dfEpochSecOfYear;
    *pnYear = psModel->nEpochYear;
}
