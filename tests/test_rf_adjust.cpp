// The rational function model refined by control points: the image-space
// adjustment fitted by least squares, and its RPC text equivalent.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <random>
#include <string>
#include <vector>

#include "lumo.h"
#include "support/model_records.h"
#include "support/numbered_error.h"
#include "support/warnings.h"

namespace {

using lumo::support::RfPtr;

// The delivered model: the scene model, whose pixel and line share one
// denominator unless bDistinct, and the true one: the same under an
// image-space bias, rotation and scale (second-order terms too for that
// kind).
RfPtr Delivered(bool bDistinct = true) {
    RfPtr psRF = lumo::support::RfSceneModel();
    if (bDistinct) psRF->padfLineDen[1] = 0.004, psRF->padfLineDen[2] = 0.003;
    return psRF;
}

RfPtr TrueModel(int nKind, bool bDistinct = true) {
    RfPtr psTrue = Delivered(bDistinct);
    const double theta = 3e-4, scale = 1.5e-4;  // 3 px and 1.5 px at the image edge
    const double a[6] = {7.3 + 0.5, scale, -theta, 2e-8, -1e-8, 3e-8};
    const double b[6] = {-4.1 + 0.5, theta, scale, -2e-8, 1e-8, 2e-8};
    std::copy_n(a, nKind, psTrue->adfPixelAdjust);
    std::copy_n(b, nKind, psTrue->adfLineAdjust);
    psTrue->nAdjust = 1;
    return psTrue;
}

struct Points {
    std::vector<double> x, y, z, pixel, line;
    int Count() const { return static_cast<int>(x.size()); }
};

// nx by ny ground points from edge to edge of the scene, heights 300 to
// 1300 m, measured in `psTruth` with Gaussian noise of sigma pixels.
Points Measure(RFInfo_t* psTruth, int nx, int ny, double sigma, unsigned seed) {
    std::mt19937 rng(seed);
    std::normal_distribution<double> noise(0.0, sigma);
    Points pts;
    for (int i = 0; i < nx; ++i) {
        for (int j = 0; j < ny; ++j) {
            const double u = 2.0 * i / std::max(nx - 1, 1) - 1.0;
            const double v = 2.0 * j / std::max(ny - 1, 1) - 1.0;
            pts.x.push_back(7.45 + 0.16 * (nx - 1.0) / nx * u + 0.01 * (j % 2));
            pts.y.push_back(46.95 + 0.11 * (ny - 1.0) / ny * v - 0.007 * (i % 2));
            pts.z.push_back(300.0 + 250.0 * ((i * ny + j) % 5));
            double p = 0.0, l = 0.0;
            RFGeo2Img(psTruth, pts.x.back(), pts.y.back(), pts.z.back(), &p, &l);
            pts.pixel.push_back(p + noise(rng));
            pts.line.push_back(l + noise(rng));
        }
    }
    return pts;
}

// Check RMS of psB against psA on a 9 x 9 grid: the larger of the pixel and
// the line RMS, as the project's accuracy figures are given.
double CheckRms(RFInfo_t* psA, RFInfo_t* psB) {
    const Points check = Measure(psA, 9, 9, 0.0, 1);
    double sumPixel = 0.0, sumLine = 0.0;
    for (int i = 0; i < check.Count(); ++i) {
        double p = 0.0, l = 0.0;
        RFGeo2Img(psB, check.x[i], check.y[i], check.z[i], &p, &l);
        sumPixel += std::pow(p - check.pixel[i], 2);
        sumLine += std::pow(l - check.line[i], 2);
    }
    return std::sqrt(std::max(sumPixel, sumLine) / check.Count());
}

int Fit(RFInfo_t* psRF, int nKind, Points& pts) {
    return RFComputeAdjustment(psRF, nKind, pts.Count(), pts.x.data(), pts.y.data(), pts.z.data(),
                               pts.pixel.data(), pts.line.data());
}

// Exact points give back the true adjustment of every kind; six points with
// 0.3 px noise compensate a known bias and rotation. The check RMS of one
// noise draw is itself random (0.15 to 0.51 px over these 20), so the bound
// is on their mean, with a margin on the worst.
TEST(RFAdjustment, RecoversTheTrueAdjustment) {
    for (const int nKind : {RF_ADJUST_SHIFT, RF_ADJUST_AFFINE, RF_ADJUST_SECOND}) {
        RfPtr psRF = Delivered();
        RfPtr psTruth = TrueModel(nKind);
        Points pts = Measure(psTruth.get(), 3, 3, 0.0, 7);
        EXPECT_GT(CheckRms(psTruth.get(), psRF.get()), 4.0) << nKind;
        ASSERT_EQ(Fit(psRF.get(), nKind, pts), 1) << nKind;
        EXPECT_LT(CheckRms(psTruth.get(), psRF.get()), 1e-6) << nKind;
    }
    double dfSum = 0.0, dfWorst = 0.0;
    for (unsigned seed = 1; seed <= 20; ++seed) {
        RfPtr psRF = Delivered();
        RfPtr psTruth = TrueModel(RF_ADJUST_AFFINE);
        Points pts = Measure(psTruth.get(), 3, 2, 0.3, seed);
        ASSERT_EQ(Fit(psRF.get(), RF_ADJUST_AFFINE, pts), 1);
        const double dfRms = CheckRms(psTruth.get(), psRF.get());
        dfSum += dfRms;
        dfWorst = std::max(dfWorst, dfRms);
    }
    EXPECT_LE(dfSum / 20.0, 0.35);
    EXPECT_LE(dfWorst, 0.6);
}

TEST(RFAdjustment, UndeterminedTermsLeaveTheRecordAndBadInputIsNamed) {
    RfPtr psRF = Delivered();
    RfPtr psTruth = TrueModel(RF_ADJUST_AFFINE);
    Points pts = Measure(psTruth.get(), 2, 2, 0.0, 3);
    Points one = pts;  // four times one point: only a shift is determined
    for (std::vector<double>* v : {&one.x, &one.y, &one.z, &one.pixel, &one.line}) {
        v->assign(4, v->front());
    }
    {
        lumo::support::WarningCapture quiet;
        EXPECT_EQ(Fit(psRF.get(), RF_ADJUST_AFFINE, one), 0);
    }
    EXPECT_EQ(Fit(psRF.get(), RF_ADJUST_SECOND, pts), 0);  // fewer points than terms
    EXPECT_EQ(psRF->nAdjust, 0);
    EXPECT_EQ(psRF->adfPixelAdjust[0], 0.0);

    using lumo::support::FatalOf;
    EXPECT_EQ(FatalOf([&] { Fit(psRF.get(), 4, pts); }).first, 11);
    EXPECT_EQ(FatalOf([&] { Fit(nullptr, RF_ADJUST_SHIFT, pts); }).first, 11);
    pts.line[2] = std::nan("");
    const auto nan = FatalOf([&] { Fit(psRF.get(), RF_ADJUST_SHIFT, pts); });
    EXPECT_EQ(nan.first, 11);
    EXPECT_NE(nan.second.find("control point 3"), std::string::npos) << nan.second;
    EXPECT_EQ(psRF->nAdjust, 0);
}

std::string WriteError(const RFInfo_t* psRF) {
    try {
        LumoRFInfoToRPCText(psRF, LUMO_RPC_TEXT_TXT);
    } catch (const nova::DataException& e) {
        return e.what();
    }
    return "";
}

// An adjustment folds into RPC text exactly where the text can express it:
// a scale-and-shift always, cross terms over one shared denominator.
TEST(RFAdjustment, RpcTextCarriesTheAdjustmentWhereItCan) {
    for (const bool bDistinct : {true, false}) {
        RfPtr psTruth = TrueModel(RF_ADJUST_AFFINE, bDistinct);
        if (bDistinct) psTruth->adfPixelAdjust[2] = psTruth->adfLineAdjust[1] = 0.0;
        const std::string text = LumoRFInfoToRPCText(psTruth.get(), LUMO_RPC_TEXT_TXT);
        RfPtr psBack(LumoRPCTextToRFInfo(text.data(), text.size(), LUMO_RPC_TEXT_TXT, "t"));
        EXPECT_EQ(psBack->nAdjust, 0);
        EXPECT_LT(CheckRms(psTruth.get(), psBack.get()), 1e-7) << bDistinct;
    }
    EXPECT_NE(WriteError(TrueModel(RF_ADJUST_AFFINE).get()).find("denominators differ"),
              std::string::npos);
    EXPECT_NE(WriteError(TrueModel(RF_ADJUST_SECOND, false).get()).find("second-order"),
              std::string::npos);
}

}  // namespace
