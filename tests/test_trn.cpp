// Transform container: behaviour before and after a fit, unknown kinds,
// many-point polynomial fits and routing to the spline.
#include <gtest/gtest.h>

#include <cmath>
#include <random>
#include <string>
#include <vector>

#include "lumo.h"
#include "regression.h"
#include "runtime.h"
#include "support/grid_points.h"
#include "support/model_records.h"
#include "support/numbered_error.h"
#include "support/warnings.h"

namespace {

using lumo::support::TrnPtr;
using WarningRecorder = lumo::support::WarningCapture;

using Points = lumo::support::PointPairs;

// A quadratic map over n random points of a 10 km square.
Points Quadratic(int n, unsigned seed) {
    std::mt19937 rng(seed);
    std::uniform_real_distribution<double> d(0.0, 10000.0);
    Points p;
    for (int i = 0; i < n; ++i) {
        const double x = 400000.0 + d(rng), y = 5000000.0 + d(rng);
        const double u = (x - 400000.0) / 1000.0, v = (y - 5000000.0) / 1000.0;
        p.Add(x, y, 100.0 + 250.0 * u - 10.0 * v + 0.8 * u * v + 0.3 * u * u,
              -50.0 + 5.0 * u + 240.0 * v - 0.5 * v * v);
    }
    return p;
}

}  // namespace

// Before a fit every evaluation gives zeros; an unknown kind warns once at
// allocation, has no model, cannot be fitted and leaves residuals untouched.
TEST(TrnContainer, UnfittedAndUnknownKindsGiveZeros) {
    Points p = Quadratic(10, 1);
    for (int kind : std::vector<int>{TRN_POLY, TRN_TPS, 0, 7, -1, -6}) {
        SCOPED_TRACE(kind);
        const bool bKnown = kind == TRN_POLY || kind == TRN_TPS;
        WarningRecorder warnings;
        TrnPtr trn(TRNAllocate(kind));
        EXPECT_EQ(trn->pModel != nullptr, bKnown);
        ASSERT_EQ(warnings.maoReports.size(), bKnown ? 0u : 1u);
        if (!bKnown) {
            EXPECT_EQ(warnings.maoReports[0].nCode, 11);
            EXPECT_FALSE(warnings.maoReports[0].bFatal);
            const std::string expected =
                "Illegal nType (" + std::to_string(kind) + ") passed to TRNAllocate().";
            EXPECT_NE(warnings.maoReports[0].osText.find(expected), std::string::npos);
            TRNCalculate(trn.get(), p.Size(), p.x.data(), p.y.data(), p.X.data(), p.Y.data(),
                         nullptr);
        }
        EXPECT_EQ(trn->bCalculated, 0);
        double X = 5, Y = 5, Z = 5;
        EXPECT_EQ(TRNTransform(trn.get(), 1.0, 2.0, &X, &Y), 0);
        EXPECT_EQ(X, 0.0);
        EXPECT_EQ(Y, 0.0);
        X = Y = 5;
        EXPECT_EQ(TRNTransform3D(trn.get(), 1.0, 2.0, 3.0, &X, &Y, &Z), 0);
        EXPECT_EQ(X, 0.0);
        EXPECT_EQ(Z, 0.0);
        double rx = 5, ry = 5;
        TRNRMSError(trn.get(), p.Size(), p.x.data(), p.y.data(), p.X.data(), p.Y.data(), &rx, &ry);
        TRNRMSError3D(trn.get(), p.Size(), p.x.data(), p.y.data(), nullptr, p.X.data(), p.Y.data(),
                      &rx, &ry);
        EXPECT_EQ(rx, bKnown ? 0.0 : 5.0);
        EXPECT_EQ(ry, bKnown ? 0.0 : 5.0);
        EXPECT_EQ(warnings.maoReports.size(), bKnown ? 0u : 1u);
    }
}

TEST(TrnPoly, FitsMoreThan1024PointsAndMeasuresResiduals) {
    Points p = Quadratic(3000, 2);
    TrnPtr trn(TRNAllocate(TRN_POLY));
    int options[1] = {2};
    TRNCalculate(trn.get(), p.Size(), p.x.data(), p.y.data(), p.X.data(), p.Y.data(), options);
    EXPECT_EQ(trn->bCalculated, 1);
    EXPECT_EQ(static_cast<GEOInfo_t*>(trn->pModel)->nOrder, 2);
    EXPECT_EQ(static_cast<GEOInfo_t*>(trn->pModel)->nPoints, 3000);
    for (int i : {0, 1500, 2999}) {
        double X = 0, Y = 0, Z = 9;
        EXPECT_EQ(TRNTransform3D(trn.get(), p.x[i], p.y[i], 42.0, &X, &Y, &Z), 1);
        EXPECT_NEAR(X, p.X[i], 1e-6);
        EXPECT_NEAR(Y, p.Y[i], 1e-6);
        EXPECT_EQ(Z, 0.0);
    }
    // Shifted outputs: the residuals are that shift exactly (the 3-D form
    // goes through the plane one).
    std::vector<double> shifted = p.X;
    for (double& v : shifted) v += 2.0;
    double rx = -1, ry = -1;
    TRNRMSError3D(trn.get(), p.Size(), p.x.data(), p.y.data(), nullptr, shifted.data(), p.Y.data(),
                  &rx, &ry);
    EXPECT_NEAR(rx, 2.0, 1e-6);
    EXPECT_NEAR(ry, 0.0, 1e-6);

    // A point that is not finite has no image.
    double X = 7, Y = 7;
    EXPECT_EQ(TRNTransform(trn.get(), std::nan(""), p.y[0], &X, &Y), 0);
    EXPECT_EQ(X, 0.0);

    // A failed refit keeps the former fit.
    std::vector<double> bad = p.x;
    bad[5] = INFINITY;
    EXPECT_THROW(
        TRNCalculate(trn.get(), p.Size(), bad.data(), p.y.data(), p.X.data(), p.Y.data(), options),
        nova::NumberedError);
    EXPECT_EQ(trn->bCalculated, 1);
    EXPECT_EQ(TRNTransform(trn.get(), p.x[7], p.y[7], &X, &Y), 1);
    EXPECT_NEAR(X, p.X[7], 1e-6);
}

TEST(TrnTps, RoutesToTheSplineAndSurvivesFailedFits) {
    Points p = Quadratic(40, 3);
    TrnPtr trn(TRNAllocate(TRN_TPS));
    std::vector<double> z1(p.Size(), 5.0), z2(p.Size(), 0.0);
    TRNCalculate3D(trn.get(), p.Size(), p.x.data(), p.y.data(), z1.data(), p.X.data(), p.Y.data(),
                   z2.data(), nullptr);
    ASSERT_EQ(trn->bCalculated, 1);
    auto* psTps = static_cast<TPSInfo_t*>(trn->pModel);
    EXPECT_EQ(psTps->nCPs, 40);
    double X = 0, Y = 0, eX = 0, eY = 0;
    EXPECT_EQ(TRNTransform(trn.get(), 404000.0, 5003000.0, &X, &Y), 1);
    TPSTransform(psTps, 404000.0, 5003000.0, &eX, &eY);
    EXPECT_EQ(X, eX);
    EXPECT_EQ(Y, eY);
    double rx = -1, ry = -1;
    TRNRMSError(trn.get(), p.Size(), p.x.data(), p.y.data(), p.X.data(), p.Y.data(), &rx, &ry);
    EXPECT_LT(rx, 1e-6);
    EXPECT_LT(ry, 1e-6);

    // All outputs at one place: error 100, and the former spline stays.
    std::vector<double> same(p.Size(), 3.0);
    EXPECT_EQ(lumo::support::FatalOf([&] {
                  TRNCalculate(trn.get(), p.Size(), p.x.data(), p.y.data(), same.data(),
                               same.data(), nullptr);
              }).first,
              100);
    EXPECT_EQ(trn->bCalculated, 1);
    EXPECT_EQ(TRNTransform(trn.get(), 404000.0, 5003000.0, &X, &Y), 1);
    EXPECT_EQ(X, eX);
}
