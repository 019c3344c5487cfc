// Polynomial regression over control points and the pivoted QR solver.
#include <gtest/gtest.h>

// The tests are not linked with Eigen's target; its headers sit under eigen3/.
#include <Eigen/Dense>
#include <algorithm>
#include <cmath>
#include <cstring>
#include <functional>
#include <random>
#include <string>
#include <vector>

#include "regression.h"
#include "runtime.h"
#include "support/grid_points.h"
#include "support/numbered_error.h"
#include "support/poly_terms.h"
#include "support/warnings.h"

namespace {

using lumo::support::FatalOf;
using lumo::support::JitteredGrid;

using lumo::support::kTermPowers;

using Gcps = lumo::support::PointPairs;

GEOInfo_t Fit(Gcps& g, int order) {
    GEOInfo_t info;
    std::memset(&info, 0x5a, sizeof info);  // callers hand over uninitialised blocks
    int options[1] = {order};
    EXPECT_EQ(GCPRegression(&info, g.x.data(), g.y.data(), g.X.data(), g.Y.data(), g.Size(),
                            options, nullptr, nullptr),
              0);
    return info;
}

bool AllFinite(const GEOInfo_t& g) {
    for (int k = 0; k < GCP_MAX_TERMS; ++k)
        if (!std::isfinite(g.adfXCoeffs[k]) || !std::isfinite(g.adfYCoeffs[k]) ||
            !std::isfinite(g.adfNormXCoeffs[k]) || !std::isfinite(g.adfNormYCoeffs[k]))
            return false;
    for (const double a : g.adfAffine)
        if (!std::isfinite(a)) return false;
    return true;
}

}  // namespace

TEST(GCPRegression, ExactForEveryOrderWithPixelAndUtmSizedInputs) {
    // A polynomial in offsets from a scene corner, over pixel-sized inputs
    // (0..1000) and UTM-sized ones (30 km from 487000, 5120000); the fit must
    // reproduce it far below a pixel, and give its coefficients when the
    // inputs are not shifted.
    const struct {
        double dfX0, dfY0, dfExtent;
        int nSide;
    } aScenes[] = {{0.0, 0.0, 1000.0, 8}, {487000.0, 5120000.0, 30000.0, 9}};
    for (const auto& sc : aScenes) {
        for (int order = 1; order <= GCP_MAX_ORDER; ++order) {
            const int nTerms = (order + 1) * (order + 2) / 2;
            double cx[GCP_MAX_TERMS] = {}, cy[GCP_MAX_TERMS] = {};
            for (int k = 0; k < nTerms; ++k) {
                cx[k] = (k == 1 ? 2000.0 : 37.0 / (k + 1));
                cy[k] = (k == 2 ? -2000.0 : 23.0 / (k + 2));
            }
            auto truth = [&](double x, double y, double& X, double& Y) {
                const double u = (x - sc.dfX0) / sc.dfExtent, v = (y - sc.dfY0) / sc.dfExtent;
                X = lumo::support::TermSum(cx, nTerms, u, v);
                Y = lumo::support::TermSum(cy, nTerms, u, v);
            };
            Gcps g = JitteredGrid(sc.nSide * sc.nSide, sc.dfX0, sc.dfY0, sc.dfExtent, 7, truth);
            const GEOInfo_t info = Fit(g, order);
            ASSERT_EQ(info.nOrder, order);
            ASSERT_EQ(info.nTerms, nTerms);
            EXPECT_EQ(info.nFitKind, GCP_FIT_POLYNOMIAL);
            for (int k = nTerms; k < GCP_MAX_TERMS; ++k) EXPECT_EQ(info.adfXCoeffs[k], 0.0);
            if (sc.dfX0 == 0.0) {
                for (int k = 0; k < nTerms; ++k) {
                    const int nDegree = kTermPowers[k][0] + kTermPowers[k][1];
                    const double scale = std::pow(sc.dfExtent, -nDegree);
                    EXPECT_NEAR(info.adfXCoeffs[k], cx[k] * scale, 1e-9 * 2000.0 * scale) << k;
                    EXPECT_NEAR(info.adfYCoeffs[k], cy[k] * scale, 1e-9 * 2000.0 * scale) << k;
                }
                if (order == 1) {
                    for (int k = 0; k < 3; ++k) {
                        EXPECT_NEAR(info.adfAffine[k], info.adfXCoeffs[k], 1e-9);
                        EXPECT_NEAR(info.adfAffine[3 + k], info.adfYCoeffs[k], 1e-9);
                    }
                }
            }
            for (double fx : {0.07, 0.43, 0.98}) {
                for (double fy : {0.03, 0.5, 0.97}) {
                    const double x = sc.dfX0 + fx * sc.dfExtent, y = sc.dfY0 + fy * sc.dfExtent;
                    double X = 0.0, Y = 0.0, eX = 0.0, eY = 0.0;
                    ASSERT_EQ(GCPTransform(&info, x, y, &X, &Y), 0);
                    truth(x, y, eX, eY);
                    EXPECT_NEAR(X, eX, 1e-7) << "order " << order;
                    EXPECT_NEAR(Y, eY, 1e-7) << "order " << order;
                }
            }
        }
    }
}

TEST(GCPRegression, DegradesGracefullyAndNeverYieldsNaN) {
    lumo::support::WarningCapture oWarnings;
    auto expectAt = [](const GEOInfo_t& info, double x, double y, double eX, double eY) {
        double X = 0.0, Y = 0.0;
        GCPTransform(&info, x, y, &X, &Y);
        EXPECT_NEAR(X, eX, 1e-9);
        EXPECT_NEAR(Y, eY, 1e-9);
        EXPECT_TRUE(AllFinite(info));
    };
    // One point: a shift; coincident inputs: the mean shift.
    Gcps one{{100.0}, {200.0}, {110.0}, {220.0}};
    GEOInfo_t info = Fit(one, 3);
    EXPECT_EQ(info.nFitKind, GCP_FIT_SHIFT);
    EXPECT_EQ(info.nOrder, 1);
    expectAt(info, 105.0, 195.0, 115.0, 215.0);
    Gcps same{{3.0, 3.0, 3.0}, {4.0, 4.0, 4.0}, {10.0, 12.0, 14.0}, {1.0, 1.0, 4.0}};
    info = Fit(same, 1);
    EXPECT_EQ(info.nFitKind, GCP_FIT_SHIFT);
    expectAt(info, 3.0, 4.0, 12.0, 2.0);
    // Two points: rotation by 90 degrees, scale 2 and a shift, reproduced exactly.
    Gcps two{{0.0, 10.0}, {0.0, 0.0}, {5.0, 5.0}, {7.0, 27.0}};
    info = Fit(two, 2);
    EXPECT_EQ(info.nFitKind, GCP_FIT_SIMILARITY);
    expectAt(info, 0.0, 0.0, 5.0, 7.0);
    expectAt(info, 0.0, 1.0, 3.0, 7.0);
    expectAt(info, 1.0, 0.0, 5.0, 9.0);
    // Collinear points, UTM-sized: a similarity that reproduces the line.
    Gcps line;
    for (int i = 0; i < 6; ++i) {
        const double t = 1000.0 * i;
        line.Add(500000.0 + 0.6 * t, 4000000.0 + 0.8 * t, 10.0 + t / 30.0, 20.0);
    }
    info = Fit(line, 2);
    EXPECT_EQ(info.nFitKind, GCP_FIT_SIMILARITY);
    double rmsX = -1.0, rmsY = -1.0;
    GCPRootMeanSq(&info, line.x.data(), line.y.data(), line.X.data(), line.Y.data(), line.Size(),
                  &rmsX, &rmsY);
    EXPECT_LT(std::max(rmsX, rmsY), 1e-8);
    // Fewer points than the order needs: 8 points determine order 2, not 3;
    // 4 points determine only the affine map.
    for (const auto& [n, order, expected] : {std::tuple{8, 3, 2}, std::tuple{4, 2, 1}}) {
        Gcps g = JitteredGrid(n, 0.0, 0.0, 100.0, 7, [](double x, double y, double& X, double& Y) {
            X = 1.0 + 2.0 * x - y;
            Y = 3.0 - x + 0.5 * y;
        });
        int fitted = order;
        GCPRegression2(&info, "PIXEL", g.x.data(), g.y.data(), "METRE", g.X.data(), g.Y.data(),
                       g.Size(), &fitted, 0, nullptr, nullptr);
        EXPECT_EQ(fitted, expected);
        EXPECT_EQ(info.nOrder, expected);
        expectAt(info, 10.0, 20.0, 1.0, 3.0);
    }
    // Points on a circle do not determine a second-order fit (x² + y² is constant).
    Gcps circle;
    for (int i = 0; i < 12; ++i) {
        const double a = 2.0 * M_PI * i / 12;
        circle.Add(std::cos(a), std::sin(a), 3.0 * std::cos(a) + 1.0, std::sin(a) - 2.0);
    }
    info = Fit(circle, 2);
    EXPECT_EQ(info.nOrder, 1);
    EXPECT_EQ(info.nFitKind, GCP_FIT_POLYNOMIAL);
    expectAt(info, 0.5, 0.25, 2.5, -1.75);
    EXPECT_EQ(oWarnings.maoReports.size(), 7u);  // one warning per lowered fit
}

TEST(GCPRegression, ManyPointsLeaveTheWorkArraysAlone) {
    Gcps g = JitteredGrid(3600, 0.0, 0.0, 5000.0, 7, [](double x, double y, double& X, double& Y) {
        X = 0.5 * x + 1e-5 * x * y;
        Y = -0.25 * y + 2e-5 * x * x;
    });
    ASSERT_GT(g.Size(), 1024);
    const double canary = -12345.678;
    std::vector<double> work1(1024 + 8, canary), work2(1024 + 8, canary);
    GEOInfo_t info;
    int options[1] = {2};
    ASSERT_EQ(GCPRegression(&info, g.x.data(), g.y.data(), g.X.data(), g.Y.data(), g.Size(),
                            options, work1.data(), work2.data()),
              0);
    for (int i = 1024; i < 1024 + 8; ++i) {
        EXPECT_EQ(work1[i], canary);
        EXPECT_EQ(work2[i], canary);
    }
    EXPECT_NEAR(info.adfXCoeffs[3], 1e-5, 1e-15);
    EXPECT_NEAR(info.adfYCoeffs[4], 2e-5, 1e-15);
}

TEST(GCPRegression, RootMeanSquareMatchesAnIndependentFit) {
    // Noisy data: compare with a least-squares fit by normal equations in raw
    // coordinates and residuals summed here.
    std::mt19937 rng(11);
    std::normal_distribution<double> noise(0.0, 0.5);
    Gcps g = JitteredGrid(49, 0.0, 0.0, 200.0, 7, [&](double x, double y, double& X, double& Y) {
        X = 4.0 + 0.9 * x + 0.1 * y + 1e-3 * x * y + noise(rng);
        Y = -2.0 + 1.1 * y - 2e-3 * y * y + noise(rng);
    });
    int order = 2;
    double outRmsX = 0.0, outRmsY = 0.0;
    GEOInfo_t info;
    GCPRegression2(&info, "LON", g.x.data(), g.y.data(), "PIXEL", g.X.data(), g.Y.data(), g.Size(),
                   &order, 0, &outRmsX, &outRmsY);
    EXPECT_STREQ(info.szFromUnit, "LON");
    EXPECT_STREQ(info.szToUnit, "PIXEL");
    EXPECT_EQ(order, 2);

    Eigen::MatrixXd design(g.Size(), 6);
    Eigen::VectorXd bx(g.Size()), by(g.Size());
    for (int i = 0; i < g.Size(); ++i) {
        const double x = g.x[i], y = g.y[i];
        design.row(i) << 1.0, x, y, x * y, x * x, y * y;
        bx[i] = g.X[i];
        by[i] = g.Y[i];
    }
    const Eigen::MatrixXd normal = design.transpose() * design;
    const Eigen::VectorXd ax = normal.ldlt().solve(design.transpose() * bx);
    const Eigen::VectorXd ay = normal.ldlt().solve(design.transpose() * by);
    for (int k = 0; k < 6; ++k) {
        EXPECT_NEAR(info.adfXCoeffs[k], ax[k], 1e-9 * (1.0 + std::abs(ax[k])));
        EXPECT_NEAR(info.adfYCoeffs[k], ay[k], 1e-9 * (1.0 + std::abs(ay[k])));
    }
    const double expectX = std::sqrt((design * ax - bx).squaredNorm() / g.Size());
    const double expectY = std::sqrt((design * ay - by).squaredNorm() / g.Size());
    double rmsX = 0.0, rmsY = 0.0;
    ASSERT_EQ(GCPRootMeanSq(&info, g.x.data(), g.y.data(), g.X.data(), g.Y.data(), g.Size(), &rmsX,
                            &rmsY),
              0);
    EXPECT_NEAR(rmsX, expectX, 1e-9);
    EXPECT_NEAR(rmsY, expectY, 1e-9);
    EXPECT_GT(rmsX, 0.1);
    EXPECT_DOUBLE_EQ(outRmsX, rmsX);
    EXPECT_DOUBLE_EQ(outRmsY, rmsY);
    ASSERT_EQ(GCPRootMeanSq(&info, g.x.data(), g.y.data(), g.X.data(), g.Y.data(), 0, &rmsX, &rmsY),
              0);
    EXPECT_EQ(rmsX, 0.0);
    EXPECT_EQ(rmsY, 0.0);
}

TEST(GCPRegression, BadInputIsRejectedAndTheRecordKept) {
    Gcps g = JitteredGrid(16, 0.0, 0.0, 10.0, 7, [](double x, double y, double& X, double& Y) {
        X = x + 1.0;
        Y = y - 1.0;
    });
    GEOInfo_t info = Fit(g, 1);
    const GEOInfo_t before = info;
    auto regress = [&](int n, int order, double* x1, GEOInfo_t* psInfo) {
        int options[1] = {order};
        GCPRegression(psInfo, x1, g.y.data(), g.X.data(), g.Y.data(), n, options, nullptr, nullptr);
    };
    auto expectFatal = [&](const std::function<void()>& f, const std::string& fragment) {
        const auto [code, text] = FatalOf(f);
        EXPECT_EQ(code, 100) << fragment;
        EXPECT_NE(text.find(fragment), std::string::npos) << text;
        // Bit for bit: the failed call must not have written the record.
        // NOLINTNEXTLINE(bugprone-suspicious-memory-comparison)
        EXPECT_EQ(std::memcmp(&info, &before, sizeof info), 0) << fragment;
    };
    expectFatal([&] { regress(g.Size(), 0, g.x.data(), &info); }, "order 0");
    expectFatal([&] { regress(g.Size(), 6, g.x.data(), &info); }, "order 6");
    expectFatal([&] { regress(0, 1, g.x.data(), &info); }, "points 0");
    expectFatal([&] { regress(g.Size(), 1, nullptr, &info); }, "null");
    g.x[2] = std::nan("");
    expectFatal([&] { regress(g.Size(), 1, g.x.data(), &info); }, "point 3");
    g.x[2] = 1.0;
    g.Y[1] = INFINITY;
    expectFatal([&] { regress(g.Size(), 1, g.x.data(), &info); }, "y2 = inf");
    g.Y[1] = 0.0;
    // Outputs near the largest double over a small input range: the raw
    // coefficients overflow.
    const Gcps saved = g;
    for (int i = 0; i < g.Size(); ++i) {
        g.X[i] = g.x[i] * 1e307;
        g.x[i] *= 1e-10;
    }
    expectFatal([&] { regress(g.Size(), 1, g.x.data(), &info); }, "non-finite coefficients");
    g = saved;
    expectFatal([&] { regress(g.Size(), 1, g.x.data(), nullptr); }, "null");

    // Evaluation of an empty record or a non-finite point fails without NaN.
    GEOInfo_t empty{};
    double X = 5.0, Y = 5.0;
    EXPECT_EQ(GCPTransform(&empty, 1.0, 2.0, &X, &Y), -1);
    EXPECT_EQ(X, 0.0);
    EXPECT_EQ(Y, 0.0);
    EXPECT_EQ(GCPTransform(&info, std::nan(""), 2.0, &X, &Y), -1);
    EXPECT_EQ(X, 0.0);
    EXPECT_EQ(GCPTransform(nullptr, 1.0, 2.0, &X, &Y), -1);
    double rx = 0.0, ry = 0.0;
    double* x1 = g.x.data();
    const struct {
        GEOInfo_t* psInfo;
        double* pdfX1;
        int n;
        double* pdfRmsX;
    } aRms[] = {{&empty, x1, 4, &rx},
                {&info, x1, -1, &rx},
                {&info, x1, 4, nullptr},
                {&info, nullptr, 4, &rx}};
    for (const auto& c : aRms) {
        EXPECT_EQ(FatalOf([&] {
                      GCPRootMeanSq(c.psInfo, c.pdfX1, g.y.data(), g.X.data(), g.Y.data(), c.n,
                                    c.pdfRmsX, &ry);
                  }).first,
                  100);
    }
}

namespace {

struct QrCase {
    int n;
    std::vector<double> a;  // column-major
    std::vector<int> jpvt;
    std::vector<double> qraux, x, rsd;
    int rank = -1, ind = -1;

    explicit QrCase(const Eigen::MatrixXd& m)
        : n(static_cast<int>(m.rows())),
          a(m.data(), m.data() + m.size()),
          jpvt(n),
          qraux(n),
          x(n),
          rsd(n) {}
};

}  // namespace

// The solver's results are checked through the spline fit that uses it
// (tests/test_tps.cpp: an independent solve, repeated points lowering the
// rank); here its refusals.
TEST(Dqrlsc, ReportsEveryFailure) {
    Eigen::MatrixXd m = Eigen::MatrixXd::Identity(4, 4);
    Eigen::VectorXd b = Eigen::VectorXd::Ones(4);
    auto indOf = [&](QrCase& qr, int lda, int n, double tol, int task, double* bp) {
        dqrlsc(qr.a.data(), lda, n, tol, &qr.rank, bp, qr.x.data(), qr.rsd.data(), qr.jpvt.data(),
               qr.qraux.data(), nullptr, task, &qr.ind);
        return qr.ind;
    };
    QrCase qr(m);
    EXPECT_EQ(indOf(qr, 4, 0, 1e-12, -1, b.data()), DQRLSC_BAD_ARGUMENT);
    EXPECT_EQ(indOf(qr, 3, 4, 1e-12, -1, b.data()), DQRLSC_BAD_ARGUMENT);
    EXPECT_EQ(indOf(qr, 4, 4, -1.0, -1, b.data()), DQRLSC_BAD_ARGUMENT);
    EXPECT_EQ(indOf(qr, 4, 4, std::nan(""), -1, b.data()), DQRLSC_BAD_ARGUMENT);
    EXPECT_EQ(indOf(qr, 4, 4, 1e-12, 1, b.data()), DQRLSC_BAD_ARGUMENT);
    EXPECT_EQ(indOf(qr, 4, 4, 1e-12, -1, nullptr), DQRLSC_BAD_ARGUMENT);
    // Task 2 before any factorisation: the pivots are not a permutation.
    std::fill(qr.jpvt.begin(), qr.jpvt.end(), 0);
    EXPECT_EQ(indOf(qr, 4, 4, 1e-12, 2, b.data()), DQRLSC_NO_FACTOR);
    b[2] = INFINITY;
    EXPECT_EQ(indOf(qr, 4, 4, 1e-12, -1, b.data()), DQRLSC_NOT_FINITE);
    b[2] = 1.0;
    qr.a[5] = std::nan("");
    EXPECT_EQ(indOf(qr, 4, 4, 1e-12, -1, b.data()), DQRLSC_NOT_FINITE);
    EXPECT_TRUE(std::isnan(qr.a[5]));  // nothing factorised
    QrCase zero(Eigen::MatrixXd::Zero(4, 4));
    EXPECT_EQ(indOf(zero, 4, 4, 1e-12, -1, b.data()), DQRLSC_RANK_ZERO);
    EXPECT_EQ(zero.rank, 0);
    // A valid call after all that still works.
    QrCase ok(m);
    EXPECT_EQ(indOf(ok, 4, 4, 1e-12, -1, b.data()), DQRLSC_OK);
    EXPECT_NEAR(ok.x[3], 1.0, 1e-15);
}
