// Radar geometry primitives: geodetic/Cartesian round trips against an
// independent conversion (the orbit model's too), line position
// interpolation at and beyond its ends, the 3x3 solver and the polynomial
// through points against Eigen.
#include <gtest/gtest.h>

#include <Eigen/Dense>
#include <cmath>
#include <random>
#include <vector>

#include "lumo.h"
#include "lumo_sim.h"

namespace {

constexpr double kDeg = 3.14159265358979323846 / 180.0;

std::vector<double> Wgs84Block() {
    std::vector<double> ell(RTCS_ELLIPSOID_SIZE, 0.0);
    ell[0] = 6378137.0;
    ell[1] = 6356752.314245179;
    RTCSSetEllipsoidParameters(ell.data());
    return ell;
}

TEST(RtcsGeometry, GeodeticCartesianRoundTripMatchesIndependentConversion) {
    const std::vector<double> ell = Wgs84Block();
    EXPECT_NEAR(ell[6], 0.00669437999014, 1e-13);
    EXPECT_NEAR(ell[7], 0.00673949674228, 1e-13);
    for (double lat : {-90.0, -60.5, -1.0, 0.0, 33.3, 89.999, 90.0}) {
        for (double lon : {-179.5, -120.0, 0.0, 45.0, 120.0, 180.0}) {
            for (double h : {-500.0, 0.0, 8000.0, 800000.0}) {
                const double geo[3] = {lon, lat, h};
                const lumo::sim::Ecef ref = lumo::sim::GeodeticToEcef(lat * kDeg, lon * kDeg, h);
                const double adfRef[3] = {ref.x, ref.y, ref.z};
                double xyz[3], m[3], km[3];
                RTCSGeodetic2XYZ(geo, ell.data(), xyz);
                // The orbit model's conversions, on its own ellipsoid (a polar
                // radius 0.31 m shorter), in metres and in kilometres.
                GeodeticToEcrM(lon, lat, h, m);
                GeodeticToEcr(lon, lat, h, km);
                for (int k = 0; k < 3; ++k) {
                    EXPECT_NEAR(xyz[k], adfRef[k], 1e-6);
                    EXPECT_NEAR(m[k], adfRef[k], 0.4);
                    EXPECT_NEAR(km[k] * 1000.0, m[k], 1e-6);
                }
                double back[3];
                RTCSXYZ2Geodetic(xyz, ell.data(), back);
                // The one-step closed form is exact to 0.1 mm near the
                // surface and to a few millimetres at orbit height.
                const double tolerance = h > 10000.0 ? 1e-7 : 1e-9;
                EXPECT_NEAR(back[1], lat, tolerance) << lon << " " << lat << " " << h;
                EXPECT_NEAR(back[2], h, 1e-2) << lon << " " << lat << " " << h;
                if (std::fabs(lat) < 90.0) {
                    // Longitudes of -180 and 180 are one meridian.
                    EXPECT_NEAR(std::remainder(back[0] - lon, 360.0), 0.0, 1e-9);
                }
            }
        }
    }
}

TEST(RtcsGeometry, PolarAndVectorHelpers) {
    const double lat = 0.7, lon = -2.1, r = 6.4e6;
    double xyz[3];
    RTCSPolarXYZ(&lat, &lon, &r, xyz);
    double dfLat = 0, dfLon = 0, dfHeight = 0;
    RTCSXYZPolar(xyz, 100.0, dfLat, dfLon, dfHeight);
    EXPECT_NEAR(dfLat, lat, 1e-12);
    EXPECT_NEAR(dfLon, lon, 1e-12);
    // Height above the local radius raised by 100 m: the independent local
    // radius of the ellipsoid at geodetic latitude 0.7.
    const double a = 6378137.0, b = 6356752.314245179;
    const double c = std::cos(lat), s = std::sin(lat);
    const double radius = std::sqrt((std::pow(a * a * c, 2) + std::pow(b * b * s, 2)) /
                                    (std::pow(a * c, 2) + std::pow(b * s, 2)));
    EXPECT_NEAR(dfHeight, r - radius - 100.0, 1e-3);

    const double zero[3] = {0, 0, 0};
    double out[3] = {7, 8, 9}, len = -1;
    RTCSNormalize(zero, out, &len);
    EXPECT_EQ(len, 0.0);
    EXPECT_EQ(out[0], 7.0);  // untouched
    EXPECT_EQ(RTCSInteriorAngle(0, 1, 1), 0.0);
    EXPECT_NEAR(RTCSInteriorAngle(3, 4, 5), 90.0 * kDeg, 1e-15);
    EXPECT_EQ(RTCSInteriorAngle(1, 1, 2.0000001), 3.14159265358979323846);  // no NaN
}

// A line table of nLines lines whose values are the line index, so that
// every interpolated output tells which elements it came from.
struct LineTable {
    std::vector<std::vector<double>> arrays;
    LinePosition s{};
    explicit LineTable(int nLines) : arrays(8, std::vector<double>(nLines)) {
        for (int k = 0; k < nLines; ++k) {
            for (int a = 0; a < 8; ++a) arrays[a][k] = 10.0 * a + k;
        }
        std::vector<double>* v = arrays.data();
        s = {v[0].data(), v[1].data(), v[2].data(), v[3].data(), v[4].data(),
             v[5].data(), v[6].data(), v[7].data(), 100,         nLines};
    }
};

TEST(RtcsGeometry, LinePositionInterpolationStaysInsideTheTable) {
    LineTable t(4);  // vectors of exactly 4 elements: ASan sees any overread
    const double dfNaN = std::nan("");
    // Line coordinate; then whether outside, the first range (-7: left
    // alone), the first latitude and the last longitude (0: cleared). The
    // last line and every coordinate up to one past it read element 3 only.
    const double aCases[][5] = {
        {1.0, 0, 0.0, 50.0, 40.0}, {1.5, 0, 0.5, 50.5, 40.5}, {0.25, 0, 0.0, 50.0, 40.0},
        {4.0, 0, 3.0, 53.0, 43.0}, {4.0 + 1e-9, 1, -7, 0, 0}, {4.5, 1, -7, 0, 0},
        {4.999, 1, -7, 0, 0},      {-0.25, 1, -7, 0, 0},      {dfNaN, 1, -7, 0, 0},
        {1e300, 1, -7, 0, 0},      {-1e300, 1, -7, 0, 0}};
    for (const auto& c : aCases) {
        double rf = -7, rl = -7, lat[3] = {9, 9, 9}, lon[3] = {9, 9, 9};
        int outside = -1;
        RTCSGetPositionInfo(&t.s, 4, c[0], &rf, &rl, lat, lon, &outside);
        EXPECT_EQ(outside, c[1]) << c[0];
        EXPECT_EQ(rf, c[2]) << c[0];
        EXPECT_EQ(lat[0], c[3]) << c[0];
        EXPECT_EQ(lon[2], c[4]) << c[0];
    }
    double rf = -1, rl = -1, lat[3], lon[3];
    int outside = -1;
    RTCSGetPositionInfo(&t.s, 0, 0.0, &rf, &rl, lat, lon, &outside);  // empty table
    EXPECT_EQ(outside, 1);
}

TEST(RtcsGeometry, LinePositionLongitudesWrapAndStayContinuous) {
    LineTable t(2);
    t.arrays[2][0] = 190.0;  // padfLonFirst
    t.arrays[3][0] = 179.9;  // padfLonMid, then across the 180th meridian
    t.arrays[3][1] = -179.7;
    double rf, rl, lat[3], lon[3];
    int outside;
    RTCSGetPositionInfo(&t.s, 2, 1.0, &rf, &rl, lat, lon, &outside);
    EXPECT_EQ(lon[0], -170.0);
    RTCSGetPositionInfo(&t.s, 2, 1.5, &rf, &rl, lat, lon, &outside);
    EXPECT_NEAR(lon[1], -179.9, 1e-9);  // not the mean 0.1 of the two numbers
}

TEST(RtcsGeometry, SolverMatchesEigenAndRefusesSingularSystems) {
    std::mt19937 rng(7);
    std::uniform_real_distribution<double> u(-1.0, 1.0);
    for (int trial = 0; trial < 200; ++trial) {
        using RowMajor3d = Eigen::Matrix<double, 3, 3, Eigen::RowMajor>;
        RowMajor3d m = RowMajor3d::NullaryExpr([&](Eigen::Index, Eigen::Index) { return u(rng); });
        if (trial % 10 == 0) m(0, 0) = 0.0;  // needs pivoting
        const Eigen::Vector3d rhs(u(rng), u(rng), u(rng));
        double x[3];
        int status = -5;
        RTCSSolveEqn(m.data(), m.data() + 3, m.data() + 6, rhs.data(), x, &status);
        ASSERT_EQ(status, 0);
        const Eigen::Vector3d ref = m.fullPivLu().solve(rhs);
        const double scale = 1e-12 * (1.0 + ref.norm()) / std::fabs(m.determinant());
        for (int i = 0; i < 3; ++i) EXPECT_NEAR(x[i], ref[i], scale);
    }
    const double a[3] = {1, 2, 3}, b[3] = {0.5, -1, 4}, rhs[3] = {1, 1, 1};
    const double nan[3] = {1, std::nan(""), 0};
    double x[3];
    int status = 0;
    RTCSSolveEqn(a, b, a, rhs, x, &status);
    EXPECT_EQ(status, -1);
    RTCSSolveEqn(a, b, nan, rhs, x, &status);
    EXPECT_EQ(status, -1);
}

TEST(RtcsGeometry, PolynomialThroughPoints) {
    // Degrees 1..7 against a Vandermonde solve.
    std::mt19937 rng(3);
    std::uniform_real_distribution<double> u(-2.0, 2.0);
    int status = -5;
    for (int n = 2; n <= 8; ++n) {
        std::vector<double> px(n), py(n), pc(n);
        Eigen::MatrixXd v(n, n);
        for (int i = 0; i < n; ++i) {
            px[i] = i + 0.3 * u(rng);
            py[i] = u(rng);
            for (int j = 0; j < n; ++j) v(i, j) = std::pow(px[i], j);
        }
        RTCSPolyCoef(px.data(), py.data(), pc.data(), &n, &status);
        ASSERT_EQ(status, 0);
        const Eigen::VectorXd ref =
            v.fullPivLu().solve(Eigen::Map<const Eigen::VectorXd>(py.data(), n));
        for (int j = 0; j < n; ++j) EXPECT_NEAR(pc[j], ref[j], 1e-8 * (1 + std::fabs(ref[j])));
    }

    const double dup[3] = {1, 1, 2}, y[3] = {1, 3, 7};
    double c[3];
    int n = 3;
    RTCSPolyCoef(dup, y, c, &n, &status);
    EXPECT_EQ(status, -1);  // repeated abscissa
    std::vector<double> many(21, 0.0);
    for (int bad : {1, 21}) {
        testing::internal::CaptureStdout();
        RTCSPolyCoef(many.data(), many.data(), many.data(), &bad, &status);
        const std::string text = testing::internal::GetCapturedStdout();
        EXPECT_EQ(status, -1);
        EXPECT_EQ(text, bad > 20 ? "Number of Requested Coefficients is Too Large=20\n"
                                 : "Insufficient Number of Points Entered to Solve Equation\n");
    }
}

}  // namespace
