// Thin plate spline: edge cases of the fit, exact interpolation, comparison
// with an independent solve, failures, copies, concurrency and the model
// record with its dispatch code.
#include <gtest/gtest.h>

#include <Eigen/Dense>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <memory>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "lumo.h"
#include "projection.h"
#include "regression.h"
#include "runtime.h"
#include "support/grid_points.h"
#include "support/model_records.h"
#include "support/numbered_error.h"

namespace {

using lumo::support::FatalOf;

using Points = lumo::support::PointPairs;

// Well-spread points over [x0, x0 + extent]² with a smooth non-affine map to
// an output plane.
Points SmoothPoints(int n, double x0, double extent, unsigned seed) {
    return lumo::support::JitteredGrid(
        n, x0, x0, extent, seed, [&](double x, double y, double& X, double& Y) {
            const double u = (x - x0) / extent, v = (y - x0) / extent;
            X = 1000.0 + 4000.0 * u + 300.0 * std::sin(3.0 * v);
            Y = -200.0 + 3500.0 * v + 150.0 * u * u;
        });
}

void Fit(TPSInfo_t& t, Points& p) {
    TPSCalculate(&t, p.Size(), p.x.data(), p.y.data(), p.X.data(), p.Y.data());
}

// The spline passes through every point of the set, within tol.
void ExpectInterpolates(TPSInfo_t& t, const Points& p, double tol) {
    for (int i = 0; i < p.Size(); ++i) {
        double X = 0.0, Y = 0.0;
        TPSTransform(&t, p.x[i], p.y[i], &X, &Y);
        EXPECT_NEAR(X, p.X[i], tol) << i;
        EXPECT_NEAR(Y, p.Y[i], tol) << i;
    }
}

}  // namespace

TEST(TpsFit, FewPointsGiveIdentityShiftAndAffineMaps) {
    TPSInfo_t t(0);
    double X = 0.0, Y = 0.0;
    // Fitted to no points: the identity.
    TPSCalculate(&t, 0, nullptr, nullptr, nullptr, nullptr);
    TPSTransform(&t, 3.0, -4.0, &X, &Y);
    EXPECT_EQ(X, 3.0);
    EXPECT_EQ(Y, -4.0);

    // One point: a shift.
    Points one;
    one.Add(3.0, -4.0, 13.0, 16.0);
    Fit(t, one);
    TPSTransform(&t, 5.0, 5.0, &X, &Y);
    EXPECT_DOUBLE_EQ(X, 15.0);
    EXPECT_DOUBLE_EQ(Y, 25.0);
    EXPECT_EQ(t.nRank, 1);

    // Three points: the host regression's affine map, no radial part.
    Points three;
    auto affineX = [](double x, double y) { return 2.0 + 3.0 * x - 1.0 * y; };
    auto affineY = [](double x, double y) { return -1.0 + 0.5 * x + 4.0 * y; };
    for (const auto& q : {std::pair<double, double>{0, 0}, {10, 0}, {0, 10}})
        three.Add(q.first, q.second, affineX(q.first, q.second), affineY(q.first, q.second));
    Fit(t, three);
    EXPECT_EQ(t.nCPs, 0);
    EXPECT_EQ(t.nRank, 3);
    TPSTransform(&t, 7.0, -3.0, &X, &Y);
    EXPECT_NEAR(X, affineX(7.0, -3.0), 1e-12);
    EXPECT_NEAR(Y, affineY(7.0, -3.0), 1e-12);
    GEOInfo_t reg{};
    int order = 1;
    GCPRegression2(&reg, "PIXEL", three.x.data(), three.y.data(), "METRE", three.X.data(),
                   three.Y.data(), 3, &order, 0, nullptr, nullptr);
    for (int k = 0; k < 6; ++k) EXPECT_EQ(t.adfAffine[k], reg.adfAffine[k]);
}

TEST(TpsFit, InterpolatesExactlyAndMatchesAnIndependentSolve) {
    // Map-sized coordinates: the spline's normalisation must carry them.
    Points p = SmoothPoints(60, 500000.0, 20000.0, 7);
    TPSInfo_t t(p.Size());
    Fit(t, p);
    EXPECT_EQ(t.nCPs, 60);
    EXPECT_EQ(t.nRank, 63);
    EXPECT_GT(t.dfCondition, 1.0);
    EXPECT_EQ(t.padfCPX[59], p.x[59]);  // points stored unnormalised
    ExpectInterpolates(t, p, 3.5e-5);

    // Independent solve of the same spline in coordinates local to the
    // first point (a shift leaves the spline unchanged), by LU.
    const int n = p.Size(), m = n + 3;
    Eigen::MatrixXd a = Eigen::MatrixXd::Zero(m, m);
    Eigen::VectorXd bx = Eigen::VectorXd::Zero(m), by = Eigen::VectorXd::Zero(m);
    const double ox = p.x[0], oy = p.y[0];
    auto kernel = [](double r2) { return r2 > 0.0 ? r2 * std::log(r2) : 0.0; };
    for (int i = 0; i < n; ++i) {
        a(3 + i, 0) = a(0, 3 + i) = 1.0;
        a(3 + i, 1) = a(1, 3 + i) = p.x[i] - ox;
        a(3 + i, 2) = a(2, 3 + i) = p.y[i] - oy;
        for (int j = 0; j < n; ++j)
            a(3 + i, 3 + j) = kernel(std::pow(p.x[i] - p.x[j], 2) + std::pow(p.y[i] - p.y[j], 2));
        bx[3 + i] = p.X[i];
        by[3 + i] = p.Y[i];
    }
    const Eigen::PartialPivLU<Eigen::MatrixXd> lu(a);
    const Eigen::VectorXd cx = lu.solve(bx), cy = lu.solve(by);
    std::mt19937 rng(11);
    std::uniform_real_distribution<double> d(0.0, 20000.0);
    for (int k = 0; k < 50; ++k) {
        const double x = 500000.0 + d(rng), y = 500000.0 + d(rng);
        double ex = cx[0] + cx[1] * (x - ox) + cx[2] * (y - oy);
        double ey = cy[0] + cy[1] * (x - ox) + cy[2] * (y - oy);
        for (int i = 0; i < n; ++i) {
            const double u = kernel(std::pow(x - p.x[i], 2) + std::pow(y - p.y[i], 2));
            ex += u * cx[3 + i];
            ey += u * cy[3 + i];
        }
        double X = 0.0, Y = 0.0;
        TPSTransform(&t, x, y, &X, &Y);
        EXPECT_NEAR(X, ex, 1e-7 * 4000.0);
        EXPECT_NEAR(Y, ey, 1e-7 * 3500.0);
    }
}

TEST(TpsFit, FailuresRaiseErrorHundredAndKeepTheSpline) {
    Points p = SmoothPoints(10, 0.0, 100.0, 5);
    TPSInfo_t t(0);
    Fit(t, p);
    double X0 = 0.0, Y0 = 0.0;
    TPSTransform(&t, 33.0, 44.0, &X0, &Y0);

    // Error 100 with a message naming the fault: inputs all at one place, a
    // coordinate that is not a number, a null array, a null spline.
    Points sameIn, bad = p;
    for (int i = 0; i < 5; ++i) sameIn.Add(1.0, 2.0, i, 2.0 * i);
    bad.Y[4] = std::nan("");
    const auto calc = [&](TPSInfo_t* ps, Points& q, double* x) {
        TPSCalculate(ps, q.Size(), x, q.y.data(), q.X.data(), q.Y.data());
    };
    const std::pair<std::function<void()>, const char*> aFailures[] = {
        {[&] { calc(&t, sameIn, sameIn.x.data()); }, "All GCP coordinates are equal."},
        {[&] { calc(&t, bad, bad.x.data()); }, "Control point 5 has a non-finite coordinate"},
        {[&] { calc(&t, p, nullptr); }, "a coordinate array"},
        {[&] { calc(nullptr, p, p.x.data()); }, "the spline is null"}};
    for (const auto& [fail, pszNamed] : aFailures) {
        const auto [nCode, osText] = FatalOf(fail);
        EXPECT_EQ(nCode, 100) << pszNamed;
        EXPECT_NE(osText.find(pszNamed), std::string::npos) << osText;
    }

    // The spline of the last good fit is intact.
    double X = 0.0, Y = 0.0;
    TPSTransform(&t, 33.0, 44.0, &X, &Y);
    EXPECT_EQ(X, X0);
    EXPECT_EQ(Y, Y0);
    EXPECT_EQ(t.nCPs, 10);
}

// Sets the solver must carry beyond the plain case, each through every one
// of its points: two points (no radial part), arrays allocated too small,
// enough points for the block-pivoted path with three repeated (each lowers
// the rank by one), and collinear points (the affine part one short).
TEST(TpsFit, EdgeSetsInterpolateWithTheirRank) {
    Points two, repeats = SmoothPoints(400, 0.0, 5000.0, 13), line;
    two.Add(0.0, 0.0, 100.0, 50.0);
    two.Add(10.0, 5.0, 110.0, 58.0);
    for (int i : {10, 200, 350})
        repeats.Add(repeats.x[i], repeats.y[i], repeats.X[i], repeats.Y[i]);
    for (int i = 0; i < 12; ++i)
        line.Add(100.0 * i, 50.0 * i + 3.0, 7.0 * i + 20.0 * std::sin(i), 2.0 * i * i);
    struct {
        const char* pszName;
        Points p;
        int nAlloc, nCPs, nRank;
        double dfTol;
    } aSets[] = {{"two points", two, 0, 0, 2, 1e-9},
                 {"arrays too small", SmoothPoints(25, 0.0, 100.0, 3), 2, 25, 28, 1e-7},
                 {"repeated points", repeats, 0, 403, 403, 4e-5},
                 {"collinear", line, 0, 12, 14, 2.5e-7}};
    for (auto& set : aSets) {
        SCOPED_TRACE(set.pszName);
        TPSInfo_t t(set.nAlloc);
        Fit(t, set.p);
        EXPECT_EQ(t.nCPs, set.nCPs);
        EXPECT_EQ(t.nRank, set.nRank);
        ExpectInterpolates(t, set.p, set.dfTol);
    }
}

TEST(TpsResiduals, KnownOffsetsAndEmptySets) {
    TPSInfo_t t(0);
    double mx = 9, my = 9, rx = 9, ry = 9;
    TPSRMSError(&t, 0, nullptr, nullptr, nullptr, nullptr, &mx, &my, &rx, &ry);
    EXPECT_EQ(mx, 0.0);
    EXPECT_EQ(my, 0.0);
    EXPECT_EQ(rx, 0.0);
    EXPECT_EQ(ry, 0.0);

    Points one;
    one.Add(0.0, 0.0, 10.0, 20.0);  // shift by (10, 20)
    Fit(t, one);
    // Given outputs off by +1, -1, +3 in X and 2, 2, 2 in Y.
    std::vector<double> x{1, 2, 3}, y{0, 0, 0}, X{10, 13, 10}, Y{18, 18, 18};
    TPSRMSError(&t, 3, x.data(), y.data(), X.data(), Y.data(), &mx, &my, &rx, &ry);
    EXPECT_DOUBLE_EQ(mx, (1.0 - 1.0 + 3.0) / 3.0);
    EXPECT_DOUBLE_EQ(my, 2.0);
    EXPECT_DOUBLE_EQ(rx, std::sqrt((1.0 + 1.0 + 9.0) / 3.0));
    EXPECT_DOUBLE_EQ(ry, 2.0);
    EXPECT_EQ(FatalOf([&] {
                  TPSRMSError(&t, 3, x.data(), y.data(), X.data(), Y.data(), nullptr, &my, &rx,
                              &ry);
              }).first,
              100);
}

// Copy construction is checked through TPSCopy (TpsModel, below); here
// assignment, which must copy every array and survive self-assignment.
TEST(TpsSpline, AssignmentIsDeep) {
    Points p = SmoothPoints(12, 0.0, 50.0, 1);
    auto psA = std::make_unique<TPSInfo_t>(0);
    Fit(*psA, p);
    TPSInfo_t c(3);
    c = *psA;
    c = c;
    EXPECT_EQ(c.nRank, psA->nRank);
    EXPECT_EQ(c.dfCondition, psA->dfCondition);
    double ax = 0, ay = 0, cx = 0, cy = 0;
    TPSTransform(psA.get(), 20.0, 30.0, &ax, &ay);
    psA.reset();  // the copy owns its arrays
    TPSTransform(&c, 20.0, 30.0, &cx, &cy);
    EXPECT_EQ(cx, ax);
    EXPECT_EQ(cy, ay);
}

TEST(TpsConcurrency, FitsAndEvaluationsOnSeveralThreads) {
    constexpr int kThreads = 4;
    std::vector<Points> sets;
    std::vector<std::unique_ptr<TPSInfo_t>> serial;
    for (int k = 0; k < kThreads; ++k) {
        sets.push_back(SmoothPoints(150 + 40 * k, 0.0, 1000.0, 100 + k));
        serial.emplace_back(new TPSInfo_t(0));
        Fit(*serial.back(), sets.back());
    }
    std::vector<std::unique_ptr<TPSInfo_t>> parallel(kThreads);
    std::vector<double> rmsX(kThreads, -1.0);
    std::vector<std::thread> threads;
    for (int k = 0; k < kThreads; ++k) {
        threads.emplace_back([&, k] {
            parallel[k].reset(new TPSInfo_t(0));
            Fit(*parallel[k], sets[k]);
            double mx, my, ry;
            TPSRMSError(parallel[k].get(), sets[k].Size(), sets[k].x.data(), sets[k].y.data(),
                        sets[k].X.data(), sets[k].Y.data(), &mx, &my, &rmsX[k], &ry);
        });
    }
    for (auto& th : threads) th.join();
    for (int k = 0; k < kThreads; ++k) {
        ASSERT_EQ(parallel[k]->nCPs, serial[k]->nCPs);
        EXPECT_EQ(parallel[k]->nRank, serial[k]->nRank);
        for (int i = 0; i < serial[k]->nCPs + 3; ++i)
            EXPECT_EQ(parallel[k]->padfCoefX[i], serial[k]->padfCoefX[i]);
        EXPECT_LT(rmsX[k], 1e-6);
    }
}

TEST(TpsModel, AllocateCopyAndRelease) {
    lumo::support::TpsPtr model(TPSAllocate(nullptr));
    ASSERT_NE(model->psGeoToImage, nullptr);
    ASSERT_NE(model->psProjInfo, nullptr);
    // Before a fit there is no position: the null value, not zeros, and the
    // dispatch reports the failure.
    double px = 5, ln = 5;
    EXPECT_EQ(GenGeo2Img(LUMO_CODE_TPS, model.get(), 1.0, 2.0, 0.0, &px, &ln), 0);
    EXPECT_EQ(px, LUMO_NULL_VALUE);
    EXPECT_EQ(ln, LUMO_NULL_VALUE);

    Points p = SmoothPoints(30, 0.0, 1000.0, 21);  // ground -> image
    TRNCalculate(model->psGeoToImage, p.Size(), p.x.data(), p.y.data(), p.X.data(), p.Y.data(),
                 nullptr);
    model->nPixels = 4000;
    std::strcpy(model->pszGeosys, "UTM 11 D000");

    // A copy into a record that TPSAllocate filled in place.
    auto* psRaw = static_cast<TPSMInfo_t*>(HCalloc(1, sizeof(TPSMInfo_t)));
    lumo::support::TpsPtr copy(TPSAllocate(psRaw));
    ASSERT_EQ(copy.get(), psRaw);
    TPSCopy(copy.get(), model.get());
    TPSCopy(copy.get(), nullptr);
    TPSCopy(nullptr, model.get());
    EXPECT_EQ(copy->nPixels, 4000);
    EXPECT_STREQ(copy->pszGeosys, "UTM 11 D000");
    EXPECT_NE(copy->psGeoToImage->pModel, model->psGeoToImage->pModel);
    double expectPx = 0, expectLn = 0;
    TPSGeo2Img(model.get(), 250.0, 600.0, &expectPx, &expectLn);
    model.reset();  // the copy stands alone
    TPSGeo2Img(copy.get(), 250.0, 600.0, &px, &ln);
    EXPECT_EQ(px, expectPx);
    EXPECT_EQ(ln, expectLn);
    TPSDeallocate(nullptr);
}
