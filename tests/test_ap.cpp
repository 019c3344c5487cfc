// Aerial photo model: collinearity against an independent computation, the
// corrections against their textbook formulas, round trips for every
// combination of corrections, failures, projection and model files.
#include <gtest/gtest.h>

#include <Eigen/Dense>
#include <cmath>
#include <cstring>
#include <functional>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "ap_io.h"
#include "lumo.h"
#include "model_io.h"
#include "projection.h"
#include "runtime.h"
#include "support/model_records.h"

namespace {

using lumo::cli::ApPtr;
using nlohmann::json;

constexpr double kNull = LUMO_NULL_VALUE;

using lumo::support::SetFiducials;

// The vertical photo of the simplest case: R = I, camera at (0, 0, 1000),
// f = 0.15, identity fiducial transforms, no corrections.
ApPtr VerticalPhoto() {
    ApPtr ap(APAllocate());
    ap->dfFocalLength = 0.15;
    ap->dfCameraZ = 1000.0;
    ap->adfRotation[0] = ap->adfRotation[4] = ap->adfRotation[8] = 1.0;
    SetFiducials(*ap, {0, 1, 0, 0, 0, 0, 1, 0}, {0, 1, 0, 0, 0, 0, 1, 0});
    return ap;
}

Eigen::Matrix3d Rotation(double omega, double phi, double kappa) {
    return (Eigen::AngleAxisd(kappa, Eigen::Vector3d::UnitZ()) *
            Eigen::AngleAxisd(phi, Eigen::Vector3d::UnitY()) *
            Eigen::AngleAxisd(omega, Eigen::Vector3d::UnitX()))
        .toRotationMatrix();
}

// A tilted 1:10 000 frame photo in millimetres on a 25 um scan with
// slightly rotated, affine fiducial transforms that invert each other.
ApPtr FramePhoto(unsigned nFlags) {
    ApPtr ap(APAllocate());
    const Eigen::Matrix3d R = Rotation(0.012, -0.02, 0.4);
    for (int i = 0; i < 9; ++i) ap->adfRotation[i] = R(i / 3, i % 3);
    Eigen::Matrix2d A;
    A << 40.0, 0.04, 0.035, -39.99;
    const Eigen::Vector2d c(4600.3, 4599.8);
    const Eigen::Matrix2d B = A.inverse();
    const Eigen::Vector2d b = -B * c;
    SetFiducials(*ap, {c(0), A(0, 0), A(0, 1), 0, c(1), A(1, 0), A(1, 1), 0},
                 {b(0), B(0, 0), B(0, 1), 0, b(1), B(1, 0), B(1, 1), 0});
    // f, camera X/Y/Z, principal point, k3, k5, p1, p2, Earth radius.
    lumo::support::SetFrameCamera(*ap, {153.0, 500000.0, 4000000.0, 1650.0, 0.015, -0.01, 5e-9,
                                        -1.5e-13, 5e-8, -3e-8, 6371000.0, nFlags});
    return ap;
}

// Published refraction coefficient (heights in km).
double ReferenceK(double H, double h) {
    return 0.00241 * (H / (H * H - 6 * H + 250) - h * h / ((h * h - 6 * h + 250) * H));
}

}  // namespace

TEST(Ap, VerticalPhotoEdgeCases) {
    // A null height is height 0; at the camera's height, and above the
    // camera (behind it): no image.
    ApPtr ap = VerticalPhoto();
    double p = 0, l = 0, pn = 0, ln = 0;
    APGeo2Img(ap.get(), 10, 20, 0, &p, &l);
    APGeo2Img(ap.get(), 10, 20, kNull, &pn, &ln);
    EXPECT_EQ(pn, p);
    EXPECT_EQ(ln, l);
    for (const double z : {1000.0, 1500.0}) {
        APGeo2Img(ap.get(), 10, 20, z, &p, &l);
        EXPECT_EQ(p, kNull) << z;
        EXPECT_EQ(l, kNull) << z;
    }
    // The inverse takes a null height as 0 and writes 0 back.
    APGeo2Img(ap.get(), -37.5, 81.25, 0.0, &p, &l);
    double z = kNull, x = 0, y = 0;
    EXPECT_EQ(APImg2GeoDem(ap.get(), p, l, &z, &x, &y), 1);
    EXPECT_EQ(z, 0.0);
    EXPECT_NEAR(x, -37.5, 1e-9);
    EXPECT_NEAR(y, 81.25, 1e-9);
}

TEST(Ap, MatchesIndependentCollinearity) {
    ApPtr ap = FramePhoto(0);
    Eigen::Matrix3d R;
    for (int i = 0; i < 9; ++i) R(i / 3, i % 3) = ap->adfRotation[i];
    const Eigen::Vector3d C(ap->dfCameraX, ap->dfCameraY, ap->dfCameraZ);
    const double f = ap->dfFocalLength;
    std::mt19937 rng(3);
    std::uniform_real_distribution<double> u(-1100, 1100), h(-50, 600);
    for (int i = 0; i < 200; ++i) {
        const Eigen::Vector3d G(C(0) + u(rng), C(1) + u(rng), h(rng));
        const Eigen::Vector3d v = R * (G - C);
        const double x = -f * v(0) / v(2);
        const double y = -f * v(1) / v(2);
        const double* d = ap->adfPhotoToImage;
        double p = 0, l = 0;
        APGeo2Img(ap.get(), G(0), G(1), G(2), &p, &l);
        EXPECT_NEAR(p, d[0] + d[1] * x + d[2] * y, 1e-8);
        EXPECT_NEAR(l, d[4] + d[5] * x + d[6] * y, 1e-8);
        // Inverse: the ray R^T (x, y, -f) from the camera meets the height G.z.
        double px = 0, py = 0;
        APImg2Photo(ap.get(), p, l, G(2), &px, &py);
        const Eigen::Vector3d ray = R.transpose() * Eigen::Vector3d(px, py, -f);
        const Eigen::Vector3d hit = C + ray * ((G(2) - C(2)) / ray(2));
        double z = G(2), X = 0, Y = 0;
        ASSERT_EQ(APImg2GeoDem(ap.get(), p, l, &z, &X, &Y), 1);
        EXPECT_NEAR(X, hit(0), 1e-6);
        EXPECT_NEAR(Y, hit(1), 1e-6);
    }
}

TEST(Ap, CorrectionsFollowTheirFormulas) {
    // Identity fiducials, vertical: the image shows the measured photo point.
    const double f = 153.0, H = 1530.0, R = 6371000.0, x = 100.0;
    ApPtr ap = VerticalPhoto();
    ap->dfFocalLength = f;
    ap->dfCameraZ = H;
    ap->dfEarthRadius = R;
    double xm = 0, ym = 0, xb = 0, yb = 0;

    ap->bEarthCurvature = 1;  // measured r' with r' + H r'^3 / (2 R f^2) = r
    APPhoto2Img(ap.get(), x, 0, 0, &xm, &ym);
    EXPECT_NEAR(xm + H * xm * xm * xm / (2 * R * f * f), x, 1e-9);
    EXPECT_NEAR(x - xm, 5.12e-3, 1e-4);  // about 5 um at 100 mm, 1:10 000
    EXPECT_EQ(ym, 0.0);
    APImg2Photo(ap.get(), xm, ym, 0, &xb, &yb);
    EXPECT_NEAR(xb, x, 1e-9);

    ap->bEarthCurvature = 0;
    ap->bRefraction = 1;  // measured r' with r' - K (r' + r'^3 / f^2) = r
    const double K = ReferenceK(H / 1000, 0.2);
    APPhoto2Img(ap.get(), 0, -x, 200, &xm, &ym);
    EXPECT_NEAR(ym - K * (ym + ym * ym * ym / (f * f)), -x, 1e-9);
    EXPECT_LT(ym, -x);  // refraction moves points outwards
    APImg2Photo(ap.get(), xm, ym, 200, &xb, &yb);
    EXPECT_NEAR(yb, -x, 1e-9);

    ap->bRefraction = 0;
    ap->bRadialDistortion = 1;  // k0 shifts both, P(r) scales
    ap->adfRadial[0] = 0.002;
    ap->adfRadial[3] = 5e-9;
    ap->bDecentering = 1;
    ap->adfDecentering[0] = 5e-8;
    ap->adfDecentering[1] = -3e-8;
    ap->adfDecentering[2] = 1e-6;
    const double px = 60.0, py = -80.0, r2 = px * px + py * py;
    APImg2Photo(ap.get(), px, py, 0, &xb, &yb);
    const double P = 5e-9 * r2, D = 1 + 1e-6 * r2;
    EXPECT_NEAR(xb, px + P * px + 0.002 + (5e-8 * (r2 + 2 * px * px) - 6e-8 * px * py) * D, 1e-12);
    EXPECT_NEAR(yb, py + P * py + 0.002 + (-3e-8 * (r2 + 2 * py * py) + 1e-7 * px * py) * D, 1e-12);

    // Any non-zero flag switches a correction on, in both directions alike.
    ApPtr one = FramePhoto(31), two = FramePhoto(0);
    two->bPrincipalPoint = two->bRadialDistortion = two->bDecentering = 2;
    two->bEarthCurvature = two->bRefraction = 2;
    double p1 = 0, l1 = 0, p2 = 0, l2 = 0;
    APGeo2Img(one.get(), 500300, 4000400, 75, &p1, &l1);
    APGeo2Img(two.get(), 500300, 4000400, 75, &p2, &l2);
    EXPECT_EQ(p1, p2);
    EXPECT_EQ(l1, l2);

    // Zero radius: curvature and refraction leave the principal point alone.
    ap = VerticalPhoto();
    ap->bEarthCurvature = ap->bRefraction = 1;
    ap->dfEarthRadius = R;
    APPhoto2Img(ap.get(), 0, 0, 0, &xm, &ym);
    EXPECT_EQ(xm, 0.0);
    EXPECT_EQ(ym, 0.0);
}

TEST(Ap, DistortionFarFromTheStartIsNotAccepted) {
    ApPtr ap = VerticalPhoto();
    ap->bRadialDistortion = 1;
    ap->adfRadial[0] = 300.0;  // the only solution lies 300 units away: no image
    double p = 0, l = 0;
    APPhoto2Img(ap.get(), 1.5, -2.5, 0, &p, &l);
    EXPECT_EQ(p, LUMO_NULL_VALUE);
    EXPECT_EQ(l, LUMO_NULL_VALUE);
    ap->adfRadial[0] = 150.0;  // within reach: accepted
    APPhoto2Img(ap.get(), 1.5, -2.5, 0, &p, &l);
    EXPECT_NEAR(p, 1.5 - 150.0, 1e-5);
}

TEST(Ap, RoundTripsForEveryCorrectionCombination) {
    std::mt19937 rng(11);
    std::uniform_real_distribution<double> u(-1150, 1150), h(-20, 900);
    for (unsigned flags = 0; flags < 32; ++flags) {
        ApPtr ap = FramePhoto(flags);
        double worstGround = 0, worstImage = 0;
        for (int i = 0; i < 300; ++i) {
            const double X = ap->dfCameraX + u(rng), Y = ap->dfCameraY + u(rng), Z = h(rng);
            double p = 0, l = 0;
            APGeo2Img(ap.get(), X, Y, Z, &p, &l);
            ASSERT_NE(p, kNull);
            double z = Z, Xb = 0, Yb = 0;
            ASSERT_EQ(APImg2GeoDem(ap.get(), p, l, &z, &Xb, &Yb), 1);
            worstGround = std::max(worstGround, std::hypot(Xb - X, Yb - Y));
            double pb = 0, lb = 0;
            APGeo2Img(ap.get(), Xb, Yb, Z, &pb, &lb);
            worstImage = std::max(worstImage, std::hypot(pb - p, lb - l));
        }
        // The distortion iteration stops at 1e-5 mm: 0.1 mm on the ground.
        EXPECT_LT(worstGround, 2e-4) << "flags " << flags;
        EXPECT_LT(worstImage, 1e-3) << "flags " << flags;
    }
}

TEST(Ap, UnmappablePointsAndDamagedRecords) {
    // Input that is not a number is the family property's; here geometry
    // and records that leave no image. A ray above the horizon never meets
    // the ground.
    ApPtr ap = FramePhoto(31);
    double p = 1, l = 1, x = 1, y = 1, z = 0;
    ApPtr vertical = VerticalPhoto();
    const Eigen::Matrix3d R = Rotation(1.4, 0, 0);  // 80 degrees oblique
    for (int i = 0; i < 9; ++i) vertical->adfRotation[i] = R(i / 3, i % 3);
    z = 0;
    EXPECT_EQ(APImg2GeoDem(vertical.get(), 0, -0.1, &z, &x, &y), 0);
    EXPECT_EQ(y, kNull);
    APPhoto2Geo(vertical.get(), 0, -0.1, 0, &x, &y);
    EXPECT_EQ(x, kNull);
    EXPECT_EQ(APImg2GeoDem(vertical.get(), 0, 0.1, &z, &x, &y), 1);  // below it: fine

    // No Earth radius, no flying height, no focal length: finite or null, never NaN.
    ap->dfEarthRadius = 0;
    APGeo2Img(ap.get(), 500100, 4000100, 10, &p, &l);
    ASSERT_TRUE(std::isfinite(p) && std::isfinite(l));
    z = 10;
    ASSERT_EQ(APImg2GeoDem(ap.get(), p, l, &z, &x, &y), 1);
    EXPECT_NEAR(x, 500100, 2e-4);
    ap->dfCameraZ = 0;
    APGeo2Img(ap.get(), 500100, 4000100, -1500, &p, &l);
    EXPECT_TRUE(std::isfinite(p) && std::isfinite(l));
    ap->dfFocalLength = 0;
    APGeo2Img(ap.get(), 500100, 4000100, -1500, &p, &l);
    EXPECT_EQ(p, kNull);
    EXPECT_EQ(APImg2GeoDem(ap.get(), 4600, 4600, &z, &x, &y), 0);

    // Null record or outputs: nothing is dereferenced.
    APGeo2Img(nullptr, 0, 0, 0, &p, &l);
    EXPECT_EQ(p, kNull);
    APGeo2Img(ap.get(), 0, 0, 0, nullptr, nullptr);
    EXPECT_EQ(APImg2GeoDem(nullptr, 0, 0, &z, &x, &y), 0);
    EXPECT_EQ(APImg2GeoDem(ap.get(), 0, 0, nullptr, &x, &y), 0);
}

TEST(Ap, ModelProjection) {
    ApPtr ap(APAllocate());
    ProjInfo_t proj;
    APGetModelProj(nullptr, proj);
    EXPECT_STREQ(proj.szProj, "PIXEL");
    // A conformal text stands in for one that is not; a description that
    // cannot be read gives pixels; nothing set copies the empty description.
    const struct {
        const char *pszGeosys, *pszConformal, *pszExpected;
    } aCases[] = {{"", "", ""},
                  {"LONG/LAT D000", "", "PIXEL"},
                  {"LONG/LAT D000", "UTM 31 U D000", "UTM 31 U D000"},
                  {"NOT A PROJ", "BOGUS", "PIXEL"}};
    for (const auto& c : aCases) {
        std::strcpy(ap->pszGeosys, c.pszGeosys);
        std::strcpy(ap->pszConformalGeosys, c.pszConformal);
        APGetModelProj(ap.get(), proj);
        EXPECT_STREQ(proj.szProj, c.pszExpected) << c.pszGeosys;
    }
    // A projected text with parameters carries them over from psProjInfo.
    std::strcpy(ap->pszGeosys, "TM D005");
    ASSERT_EQ(Geosys2ProjInfo(ap->psProjInfo, "TM D005", 0, 0, 1, 1), 0);
    ASSERT_EQ(ProjParms2Info("GCTP 9 1 2:0.9996012717 4:-2000000 5:49000000 6:400000 7:-100000",
                             ap->psProjInfo),
              0);
    APGetModelProj(ap.get(), proj);
    EXPECT_STREQ(proj.szProj, "TM D005");
    EXPECT_EQ(proj.adfProjParms[2], 0.9996012717);
    EXPECT_EQ(proj.adfProjParms[6], 400000.0);
    // A buffer filled to its last byte without a terminator is read as its
    // first 16 characters, never past it.
    std::memset(ap->pszGeosys, 0, AP_GEOSYS_SIZE);
    std::memcpy(ap->pszGeosys, "UTM 31 U D000   X", AP_GEOSYS_SIZE);
    APGetModelProj(ap.get(), proj);
    EXPECT_STREQ(proj.szProj, "UTM 31 U D000");
}

TEST(Ap, ModelFileRoundTripAndErrors) {
    ApPtr ap = FramePhoto(0b10110);
    std::strcpy(ap->pszGeosys, "UTM 31 U D000");
    std::strcpy(ap->pszConformalGeosys, "UTM 32 U D000");
    ap->adfRadial[0] = 0.001;
    const json document = lumo::cli::ApToJson(*ap, 9200, 9100);
    const lumo::cli::LoadedModel model = lumo::cli::ReadModel(json::parse(document.dump()), "m");
    ASSERT_EQ(model.nModelCode, LUMO_CODE_AP);
    const auto* back = static_cast<const APInfo_t*>(model.poRecord.get());
    EXPECT_EQ(model.sEnvelope.nLines, 9100);
    // Every value the model uses comes back bit for bit: written again, the
    // record gives the same document.
    EXPECT_EQ(lumo::cli::ApToJson(*back, 9200, 9100), document);
    EXPECT_EQ(back->bRadialDistortion, 1);
    EXPECT_STREQ(back->psProjInfo->szProj, "UTM 31 U D000");

    const std::pair<std::function<void(json&)>, const char*> aDamages[] = {
        {[](json& d) { d["ap"]["rotation"][0] = 2.0; }, "adfRotation"},
        {[](json& d) {
             d["ap"]["corrections"]["earthCurvature"] = true;
             d["ap"]["earthRadius"] = 0;
         },
         "dfEarthRadius = 0"},
        {[](json& d) { d["ap"]["focalLength"] = 0; }, "dfFocalLength = 0"}};
    for (const auto& [damage, pszNamed] : aDamages) {
        json bad = document;
        damage(bad);
        try {
            lumo::cli::ReadModel(bad, "bad.json");
            ADD_FAILURE() << "accepted: " << pszNamed;
        } catch (const nova::DataException& e) {
            EXPECT_NE(std::string(e.what()).find(pszNamed), std::string::npos) << e.what();
        }
    }
    ap->dfCameraX = std::nan("");
    EXPECT_THROW(lumo::cli::ApToJson(*ap, 1, 1), nova::DataException);
}
