// Aerial photo model: collinearity of a frame camera with fiducial
// transforms and the corrections for principal point, lens distortion,
// atmospheric refraction and Earth curvature.
#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>

#include "inverse_check.h"
#include "lumo_ap.h"
#include "null_value.h"
#include "projection.h"
#include "record_check.h"

namespace {

constexpr double kNewtonTolerance = 1e-7;
constexpr int kNewtonIterations = 50;
constexpr double kDistortionTolerance = 1e-5;
constexpr double kDistortionMaxShift = 200.0;
constexpr int kDistortionIterations = 10;

// A height of -1e20 is not given: the model takes the ground at 0.
double GroundHeight(double dfZ) {
    return dfZ == LUMO_NULL_VALUE ? 0.0 : dfZ;
}

bool IsUsableFocalLength(double dfF) {
    return std::isfinite(dfF) && dfF != 0.0;
}

// The radial displacement factors of one call, which depend on the point's
// height only: the curvature displaces radius r' by c r'^3, the refraction by
// K (r' + r'^3/f^2).
// A factor whose inputs cannot give a finite value (no Earth radius, camera
// not above sea level, no focal length) switches its correction off, in both
// directions alike, instead of spreading infinities into the result.
struct RadialCorrections {
    bool bCurvature = false;
    bool bRefraction = false;
    double dfCurvature = 0.0;   // H' / (2 R f^2)
    double dfRefraction = 0.0;  // K
    double dfInvF2 = 0.0;       // 1 / f^2
};

// Refraction coefficient for flying height H and ground height h in km.
double RefractionCoefficient(double dfH, double dfh) {
    return 0.00241 * (dfH / (dfH * dfH - 6.0 * dfH + 250.0) -
                      dfh * dfh / ((dfh * dfh - 6.0 * dfh + 250.0) * dfH));
}

RadialCorrections MakeRadialCorrections(const APInfo_t& ap, double dfZ) {
    RadialCorrections c;
    const double dfF = ap.dfFocalLength;
    if (!IsUsableFocalLength(dfF)) return c;
    c.dfInvF2 = 1.0 / (dfF * dfF);
    if (ap.bEarthCurvature != 0 && ap.dfEarthRadius > 0.0 && std::isfinite(ap.dfEarthRadius)) {
        // Image displacement H' r^3 / (2 R f^2), H' the height above the ground.
        c.dfCurvature = (ap.dfCameraZ - dfZ) / (2.0 * ap.dfEarthRadius) * c.dfInvF2;
        c.bCurvature = std::isfinite(c.dfCurvature);
    }
    if (ap.bRefraction != 0 && ap.dfCameraZ > 0.0) {
        c.dfRefraction = RefractionCoefficient(ap.dfCameraZ / 1000.0, dfZ / 1000.0);
        c.bRefraction = std::isfinite(c.dfRefraction);
    }
    return c;
}

// Scales (x, y) from radius r to r'; r follows. A zero radius stays.
void ScaleRadius(double& dfRadius, double dfNew, double& x, double& y) {
    if (dfRadius == 0.0) return;
    const double dfScale = dfNew / dfRadius;
    x *= dfScale;
    y *= dfScale;
    dfRadius = dfNew;
}

// Newton's method for g(r') = r, started at r' = r, with g and its
// derivative g'. Once a step falls below the tolerance the root is verified:
// g maps it back onto r within the tolerance times g', and it is a positive
// finite radius (another would mirror the point through the principal
// point). False when the iteration runs out or the root fails the check.
template <typename G, typename DG>
bool SolveRadius(double dfRadius, G g, DG dg, double& dfRoot) {
    double r = dfRadius;
    for (int i = 0; i < kNewtonIterations; ++i) {
        const double dfStep = (g(r) - dfRadius) / dg(r);
        r -= dfStep;
        if (std::fabs(dfStep) < kNewtonTolerance) {
            dfRoot = r;
            return r > 0.0 && std::isfinite(r) &&
                   std::fabs(g(r) - dfRadius) <= kNewtonTolerance * std::fabs(dg(r));
        }
    }
    return false;
}

// Ideal radius r -> measured r' for the curvature: r' + c r'^3 = r. dfRadius
// is the radius of (x, y) and follows it. False when there is no root.
bool RemoveCurvature(const RadialCorrections& c, double& x, double& y, double& dfRadius) {
    const double r = dfRadius;
    if (r == 0.0) return true;
    const double k = c.dfCurvature;
    double dfRoot = r;
    const auto g = [k](double s) { return s + k * s * s * s; };
    const auto dg = [k](double s) { return 1.0 + 3.0 * k * s * s; };
    if (!SolveRadius(r, g, dg, dfRoot)) return false;
    ScaleRadius(dfRadius, dfRoot, x, y);
    return true;
}

// Ideal radius r -> measured r' for the refraction: r' - K r' (1 + r'^2/f^2) = r.
bool AddRefraction(const RadialCorrections& c, double& x, double& y, double& dfRadius) {
    const double r = dfRadius;
    if (r == 0.0) return true;
    const double K = c.dfRefraction;
    const double dfInvF2 = c.dfInvF2;
    double dfRoot = r;
    const auto g = [K, dfInvF2](double s) { return s - K * s * (1.0 + s * s * dfInvF2); };
    const auto dg = [K, dfInvF2](double s) { return 1.0 - K * (1.0 + 3.0 * s * s * dfInvF2); };
    if (!SolveRadius(r, g, dg, dfRoot)) return false;
    ScaleRadius(dfRadius, dfRoot, x, y);
    return true;
}

bool HasDistortion(const APInfo_t& ap) {
    return ap.bRadialDistortion != 0 || ap.bDecentering != 0;
}

// Radial plus decentering displacement at (x, y).
void Distortion(const APInfo_t& ap, double x, double y, double& dx, double& dy) {
    const double r2 = x * x + y * y;
    dx = 0.0;
    dy = 0.0;
    if (ap.bRadialDistortion != 0) {
        const double* k = ap.adfRadial;
        const double r = std::sqrt(r2);
        const double P =
            k[1] + r * (k[2] + r * (k[3] + r * (k[4] + r * (k[5] + r * (k[6] + r * k[7])))));
        dx = P * x + k[0];
        dy = P * y + k[0];
    }
    if (ap.bDecentering != 0) {
        const double* p = ap.adfDecentering;
        const double D = 1.0 + r2 * (p[2] + p[3] * r2);
        const double xy2 = 2.0 * x * y;
        dx += (p[0] * (r2 + 2.0 * x * x) + p[1] * xy2) * D;
        dy += (p[1] * (r2 + 2.0 * y * y) + p[0] * xy2) * D;
    }
}

// Finds the measured (x', y') whose distortion brings it to the ideal (x, y)
// by fixed-point iteration; an estimate is accepted only when its distortion
// lands on (x, y) within the tolerance. False, with (x, y) as they were, when
// no estimate is accepted.
bool AddDistortion(const APInfo_t& ap, double& x, double& y) {
    double xs = x;
    double ys = y;
    for (int i = 0; i < kDistortionIterations; ++i) {
        double dx = 0.0;
        double dy = 0.0;
        Distortion(ap, xs, ys, dx, dy);
        const double Fx = xs + dx - x;
        const double Fy = ys + dy - y;
        if (std::fabs(Fx) < kDistortionTolerance && std::fabs(Fy) < kDistortionTolerance) {
            // A far estimate is a spurious root: it is neither taken nor moved.
            if (std::fabs(xs - x) < kDistortionMaxShift &&
                std::fabs(ys - y) < kDistortionMaxShift) {
                x = xs;
                y = ys;
                return true;
            }
            continue;
        }
        xs -= Fx;
        ys -= Fy;
    }
    return false;
}

void PhotoToImage(const double* d, double x, double y, double* pdfPixel, double* pdfLine) {
    const double xy = x * y;
    *pdfPixel = d[0] + d[1] * x + d[2] * y + d[3] * xy;
    *pdfLine = d[4] + d[5] * x + d[6] * y + d[7] * xy;
}

// Ideal photo coordinates to measured ones (before the principal point and
// the fiducial transform): each correction that is on is solved by
// iteration. False when one of them has no verified solution: the point has
// no image then, rather than an image without that correction.
bool IdealToMeasured(const APInfo_t& ap, double dfZ, double& x, double& y) {
    const RadialCorrections c = MakeRadialCorrections(ap, dfZ);
    if (c.bCurvature || c.bRefraction) {
        double r = std::sqrt(x * x + y * y);
        if (c.bCurvature && !RemoveCurvature(c, x, y, r)) return false;
        if (c.bRefraction && !AddRefraction(c, x, y, r)) return false;
    }
    return !HasDistortion(ap) || AddDistortion(ap, x, y);
}

// Ideal photo coordinates to image; the null value when the corrections
// have no solution.
void PhotoToImageCorrected(const APInfo_t& ap, double x, double y, double dfZ, double* pdfPixel,
                           double* pdfLine) {
    if (!IdealToMeasured(ap, dfZ, x, y)) {
        lumo::SetNullPair(pdfPixel, pdfLine);
        return;
    }
    if (ap.bPrincipalPoint != 0) {
        x += ap.dfPrincipalX;
        y += ap.dfPrincipalY;
    }
    PhotoToImage(ap.adfPhotoToImage, x, y, pdfPixel, pdfLine);
}

// Collinearity: ground to ideal photo coordinates. False for points at the
// camera's height, in the plane of the perspective centre or behind it.
bool GroundToIdeal(const APInfo_t& ap, double dfX, double dfY, double dfZ, double& x, double& y) {
    const double dX = dfX - ap.dfCameraX;
    const double dY = dfY - ap.dfCameraY;
    const double dZ = dfZ - ap.dfCameraZ;
    const double* R = ap.adfRotation;
    const double N = R[6] * dX + R[7] * dY + R[8] * dZ;
    // -f/N scales the camera-frame vector onto the photo plane; it is
    // positive only for points in front of the camera.
    const double dfScale = -ap.dfFocalLength / N;
    if (dZ == 0.0 || !(dfScale > 0.0) || !std::isfinite(dfScale)) return false;
    x = dfScale * (R[0] * dX + R[1] * dY + R[2] * dZ);
    y = dfScale * (R[3] * dX + R[4] * dY + R[5] * dZ);
    return true;
}

// Measured photo coordinates of an image point: the fiducial transform and
// the principal point.
void ImageToMeasured(const APInfo_t& ap, double dfPixel, double dfLine, double& x, double& y) {
    const double* e = ap.adfImageToPhoto;
    const double pl = dfPixel * dfLine;
    x = e[0] + e[1] * dfPixel + e[2] * dfLine + e[3] * pl;
    y = e[4] + e[5] * dfPixel + e[6] * dfLine + e[7] * pl;
    if (ap.bPrincipalPoint != 0) {
        x -= ap.dfPrincipalX;
        y -= ap.dfPrincipalY;
    }
}

// The inverse's answer projected forward lands on the measured photo point
// it came from: within twice the distortion iteration's own tolerance (photo
// units), or within the inverse tolerance in pixels of the fiducial
// transform's scale at that point.
bool ProjectsBack(const APInfo_t& ap, double dfX, double dfY, double dfZ, double xm, double ym) {
    double x = 0.0;
    double y = 0.0;
    if (!GroundToIdeal(ap, dfX, dfY, dfZ, x, y) || !IdealToMeasured(ap, dfZ, x, y)) return false;
    const double dx = x - xm;
    const double dy = y - ym;
    if (lumo::WithinInverseTolerance(dx, dy, 2.0 * kDistortionTolerance)) return true;
    const double* d = ap.adfPhotoToImage;
    const double xp = xm + (ap.bPrincipalPoint != 0 ? ap.dfPrincipalX : 0.0);
    const double yp = ym + (ap.bPrincipalPoint != 0 ? ap.dfPrincipalY : 0.0);
    return lumo::WithinInverseTolerance((d[1] + d[3] * yp) * dx + (d[2] + d[3] * xp) * dy,
                                        (d[5] + d[7] * yp) * dx + (d[6] + d[7] * xp) * dy);
}

// Both outputs finite, or both the null value.
void FiniteOrNull(double* pdfA, double* pdfB) {
    if (!std::isfinite(*pdfA) || !std::isfinite(*pdfB)) lumo::SetNullPair(pdfA, pdfB);
}

std::string BoundedText(const char* pszBuffer) {
    if (pszBuffer == nullptr) return std::string();
    // The buffer need not be terminated: never read past its size.
    return std::string(pszBuffer, strnlen(pszBuffer, AP_GEOSYS_SIZE - 1));
}

void SetPixel(ProjInfo_t& sProj) {
    ProjStringToProjInfo("PIXEL", &sProj);
}

// A georeferencing text the host cannot read leaves the model in pixels.
void SetFromGeosys(ProjInfo_t& sProj, const std::string& osGeosys) {
    if (Geosys2ProjInfo(&sProj, osGeosys.c_str(), 0.0, 0.0, 1.0, 1.0) < 0) SetPixel(sProj);
}

// Carries the record's projection parameters over when the projection needs them.
void CopyProjParameters(const APInfo_t& ap, ProjInfo_t& sProj) {
    if (ap.psProjInfo == nullptr) return;
    if (RequiresProjInfo(DecodeGeosys(sProj.szProj, nullptr)) == 0) return;
    std::unique_ptr<char, decltype(&std::free)> parms(ProjInfo2Parms(ap.psProjInfo), &std::free);
    if (parms) ProjParms2Info(parms.get(), &sProj);
}

}  // namespace

APInfo_t* APAllocate() {
    // Held by owners until complete, so a failed allocation leaks nothing.
    std::unique_ptr<char[]> conformal(new char[AP_GEOSYS_SIZE]());
    std::unique_ptr<char[]> geosys(new char[AP_GEOSYS_SIZE]());
    std::unique_ptr<ProjInfo_t> proj(new ProjInfo_t());
    InitProjInfo(proj.get(), 0);
    auto* psAP = new APInfo_t();
    psAP->nCarried1 = 1;
    psAP->cCode = 'M';
    psAP->pszConformalGeosys = conformal.release();
    psAP->pszGeosys = geosys.release();
    psAP->psProjInfo = proj.release();
    return psAP;
}

void APDeallocate(APInfo_t* psAP) {
    if (psAP == nullptr) return;
    delete psAP->psProjInfo;
    delete[] psAP->pszConformalGeosys;
    delete[] psAP->pszGeosys;
    delete psAP;
}

void APGeo2Img(const APInfo_t* psAP, double dfX, double dfY, double dfZ, double* pdfPixel,
               double* pdfLine) {
    if (psAP == nullptr || pdfPixel == nullptr || pdfLine == nullptr) {
        lumo::SetNullPair(pdfPixel, pdfLine);
        return;
    }
    const APInfo_t& ap = *psAP;
    const double Z = GroundHeight(dfZ);
    double x = 0.0;
    double y = 0.0;
    if (!GroundToIdeal(ap, dfX, dfY, Z, x, y)) {
        lumo::SetNullPair(pdfPixel, pdfLine);
        return;
    }
    PhotoToImageCorrected(ap, x, y, Z, pdfPixel, pdfLine);
    FiniteOrNull(pdfPixel, pdfLine);
}

void APPhoto2Img(const APInfo_t* psAP, double dfPhotoX, double dfPhotoY, double dfZ,
                 double* pdfPixel, double* pdfLine) {
    if (psAP == nullptr || pdfPixel == nullptr || pdfLine == nullptr) {
        lumo::SetNullPair(pdfPixel, pdfLine);
        return;
    }
    PhotoToImageCorrected(*psAP, dfPhotoX, dfPhotoY, GroundHeight(dfZ), pdfPixel, pdfLine);
    FiniteOrNull(pdfPixel, pdfLine);
}

void APImg2Photo(const APInfo_t* psAP, double dfPixel, double dfLine, double dfZ, double* pdfPhotoX,
                 double* pdfPhotoY) {
    if (psAP == nullptr || pdfPhotoX == nullptr || pdfPhotoY == nullptr) {
        lumo::SetNullPair(pdfPhotoX, pdfPhotoY);
        return;
    }
    const APInfo_t& ap = *psAP;
    double x = 0.0;
    double y = 0.0;
    ImageToMeasured(ap, dfPixel, dfLine, x, y);
    if (HasDistortion(ap)) {
        double dx = 0.0;
        double dy = 0.0;
        Distortion(ap, x, y, dx, dy);
        x += dx;
        y += dy;
    }
    const RadialCorrections c = MakeRadialCorrections(ap, GroundHeight(dfZ));
    if (c.bRefraction) {
        const double r2 = x * x + y * y;
        // Delta r / r = K (1 + r^2/f^2); nothing moves at r = 0.
        const double dfShrink = 1.0 - c.dfRefraction * (1.0 + r2 * c.dfInvF2);
        x *= dfShrink;
        y *= dfShrink;
    }
    if (c.bCurvature) {
        const double dfGrow = 1.0 + (x * x + y * y) * c.dfCurvature;
        x *= dfGrow;
        y *= dfGrow;
    }
    *pdfPhotoX = x;
    *pdfPhotoY = y;
}

void APPhoto2Geo(const APInfo_t* psAP, double dfPhotoX, double dfPhotoY, double dfZ, double* pdfX,
                 double* pdfY) {
    if (psAP == nullptr || pdfX == nullptr || pdfY == nullptr) {
        lumo::SetNullPair(pdfX, pdfY);
        return;
    }
    const APInfo_t& ap = *psAP;
    const double* R = ap.adfRotation;
    const double f = ap.dfFocalLength;
    const double x = dfPhotoX;
    const double y = dfPhotoY;
    const double dZ = dfZ - ap.dfCameraZ;
    const double D = R[2] * x + R[5] * y - f * R[8];
    // The ray C + t (R^T (x, y, -f)) meets height Z at t = dZ / D; only a
    // positive t lies in front of the camera. A ray parallel to the ground
    // plane or pointing away from it has no ground point.
    const double t = dZ / D;
    if (!IsUsableFocalLength(f) || !(t > 0.0) || !std::isfinite(t)) {
        lumo::SetNullPair(pdfX, pdfY);
        return;
    }
    *pdfX = (R[0] * x + R[3] * y - f * R[6]) * t + ap.dfCameraX;
    *pdfY = (R[1] * x + R[4] * y - f * R[7]) * t + ap.dfCameraY;
    FiniteOrNull(pdfX, pdfY);
}

int APImg2GeoDem(const APInfo_t* psAP, double dfPixel, double dfLine, double* pdfZ, double* pdfX,
                 double* pdfY) {
    if (psAP == nullptr || pdfZ == nullptr || pdfX == nullptr || pdfY == nullptr) {
        lumo::SetNullPair(pdfX, pdfY);
        return 0;
    }
    if (*pdfZ == LUMO_NULL_VALUE) *pdfZ = 0.0;
    const double Z = *pdfZ;
    double x = 0.0;
    double y = 0.0;
    APImg2Photo(psAP, dfPixel, dfLine, Z, &x, &y);
    APPhoto2Geo(psAP, x, y, Z, pdfX, pdfY);
    if (*pdfX == LUMO_NULL_VALUE) return 0;
    // The corrections are removed in closed form; beyond the region where the
    // forward iterations invert them (a distortion that folds over, a
    // refraction radius past its maximum) that answer is not the model's.
    double xm = 0.0;
    double ym = 0.0;
    ImageToMeasured(*psAP, dfPixel, dfLine, xm, ym);
    if (!ProjectsBack(*psAP, *pdfX, *pdfY, Z, xm, ym)) {
        lumo::SetNullPair(pdfX, pdfY);
        return 0;
    }
    return 1;
}

void APGetModelProj(const APInfo_t* psAP, ProjInfo_t& sProj) {
    InitProjInfo(&sProj, 0);
    if (psAP == nullptr) {
        SetPixel(sProj);
        return;
    }
    const std::string osGeosys = BoundedText(psAP->pszGeosys);
    const std::string osConformal = BoundedText(psAP->pszConformalGeosys);
    if (!osGeosys.empty() && IsConformal(osGeosys.c_str()) == 1) {
        SetFromGeosys(sProj, osGeosys);
        CopyProjParameters(*psAP, sProj);
    } else if (!osConformal.empty()) {
        SetFromGeosys(sProj, osConformal);
    } else if (osGeosys.empty() && psAP->psProjInfo != nullptr) {
        sProj = *psAP->psProjInfo;
    } else {
        SetPixel(sProj);
    }
}

// ---------------------------------------------------------------------------
// Validation
// ---------------------------------------------------------------------------

namespace {

// Largest deviation of R R^T from the identity that still counts as a rotation.
constexpr double kRotationTolerance = 1e-6;

// Largest |(R R^T - I)_ij|: photo to ground uses R^T as the inverse of R.
double RotationDeviation(const double* R) {
    double deviation = 0.0;
    for (int i = 0; i < 3; ++i) {
        for (int j = 0; j < 3; ++j) {
            double dot = 0.0;
            for (int k = 0; k < 3; ++k) dot += R[3 * i + k] * R[3 * j + k];
            deviation = std::max(deviation, std::fabs(dot - (i == j ? 1.0 : 0.0)));
        }
    }
    return deviation;
}

std::string CheckFinite(const APInfo_t& ap) {
    const double adfScalars[] = {ap.dfFocalLength, ap.dfCameraX,    ap.dfCameraY,
                                 ap.dfCameraZ,     ap.dfPrincipalX, ap.dfPrincipalY};
    const char* apszScalars[] = {"dfFocalLength", "dfCameraX",    "dfCameraY",
                                 "dfCameraZ",     "dfPrincipalX", "dfPrincipalY"};
    for (int i = 0; i < 6; ++i) {
        if (!std::isfinite(adfScalars[i])) {
            return lumo::FieldProblem(apszScalars[i], adfScalars[i], "must be a finite number");
        }
    }
    const struct {
        const char* pszName;
        const double* padf;
        int nCount;
    } asArrays[] = {{"adfRotation", ap.adfRotation, 9},
                    {"adfImageToPhoto", ap.adfImageToPhoto, 8},
                    {"adfPhotoToImage", ap.adfPhotoToImage, 8},
                    {"adfRadial", ap.adfRadial, 8},
                    {"adfDecentering", ap.adfDecentering, 4}};
    for (const auto& a : asArrays) {
        std::string problem = lumo::FirstNonFinite(a.pszName, a.padf, a.nCount);
        if (!problem.empty()) return problem;
    }
    return "";
}

// A fiducial transform whose linear part is singular maps the photo onto a line.
std::string CheckFiducial(const char* pszName, const double* t) {
    const double det = t[1] * t[6] - t[2] * t[5];
    if (det != 0.0 && std::isfinite(det)) return "";
    return lumo::FieldProblem(std::string(pszName) + " determinant", det,
                              "the linear part of the fiducial transform must be invertible");
}

}  // namespace

std::string APValidate(const APInfo_t* psAP) {
    if (psAP == nullptr) return "the record is null";
    const APInfo_t& ap = *psAP;
    std::string problem = CheckFinite(ap);
    if (!problem.empty()) return problem;
    if (ap.dfFocalLength == 0.0) return lumo::FieldProblem("dfFocalLength", 0.0, "must not be 0");
    const double deviation = RotationDeviation(ap.adfRotation);
    if (deviation > kRotationTolerance) {
        return lumo::FieldProblem(
            "adfRotation", deviation,
            "must be a rotation matrix (R R^T = I to 1e-6); this is its largest deviation");
    }
    problem = CheckFiducial("adfImageToPhoto", ap.adfImageToPhoto);
    if (problem.empty()) problem = CheckFiducial("adfPhotoToImage", ap.adfPhotoToImage);
    if (!problem.empty()) return problem;
    if (ap.bEarthCurvature != 0 && !(ap.dfEarthRadius > 0.0 && std::isfinite(ap.dfEarthRadius))) {
        return lumo::FieldProblem("dfEarthRadius", ap.dfEarthRadius,
                                  "must be positive when the Earth curvature correction is on");
    }
    if (ap.bRefraction != 0 && !(ap.dfCameraZ > 0.0)) {
        return lumo::FieldProblem("dfCameraZ", ap.dfCameraZ,
                                  "the refraction correction needs a camera above sea level");
    }
    return "";
}
