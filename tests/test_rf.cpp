// Rational function model: allocation, forward and inverse transforms against
// an independent evaluation, the adjustment, the antimeridian, the Newton
// step and unusable records.
#include <gtest/gtest.h>

#include <cmath>

#include "lumo.h"
#include "nova/projection.h"
#include "nova/runtime.h"
#include "support/model_records.h"
#include "support/warnings.h"

namespace {

using RecordPtr = lumo::support::RfPtr;
using lumo::support::AllocateRf;
using lumo::support::RfSceneModel;

// Independent evaluation of one polynomial, term by term from the table.
double Polynomial(const double* c, int nTerms, double U, double V, double W) {
    const double t[20] = {1,         U,         V,         W,         U * V,
                          U * W,     V * W,     U * U,     V * V,     W * W,
                          U * V * W, U * U * U, U * V * V, U * W * W, U * U * V,
                          V * V * V, V * W * W, U * U * W, V * V * W, W * W * W};
    double sum = 0.0;
    for (int i = 0; i < nTerms; ++i) sum += c[i] * t[i];
    return sum;
}

void ExpectedImage(const RFInfo_t& m, double x, double y, double z, double* p, double* l) {
    const double U = (x - m.dfXOffset) / m.dfXScale;
    const double V = (y - m.dfYOffset) / m.dfYScale;
    const double W = (z - m.dfZOffset) / m.dfZScale;
    *p = Polynomial(m.padfPixelNum, m.nTerms, U, V, W) /
             Polynomial(m.padfPixelDen, m.nTerms, U, V, W) * m.dfPixelScale +
         m.dfPixelOffset;
    *l = Polynomial(m.padfLineNum, m.nTerms, U, V, W) /
             Polynomial(m.padfLineDen, m.nTerms, U, V, W) * m.dfLineScale +
         m.dfLineOffset;
}

TEST(RFAllocate, DefaultsAndPlacementIntoExistingRecord) {
    RecordPtr psRF = AllocateRf(10);
    EXPECT_EQ(psRF->nTerms, 10);
    EXPECT_EQ(psRF->nHalfPixelShift, 1);
    EXPECT_EQ(DecodeGeosys(psRF->psProjInfo->szProj, nullptr), NOVA_PROJ_GEOGRAPHIC);
    for (int i = 0; i < 20; ++i) EXPECT_EQ(psRF->padfLineDen[i], 0.0);  // 20 although 10 terms

    // Allocation into an existing record fills it and returns it.
    RFInfo_t* psOuter = static_cast<RFInfo_t*>(HCalloc(1, sizeof(RFInfo_t)));
    EXPECT_EQ(RFAllocate(psOuter, 30), psOuter);
    psOuter->padfLineDen[29] = 1.0;  // 30 entries: in bounds
    RFDeallocate(psOuter);
    RFDeallocate(nullptr);  // no effect
}

TEST(RFGeo2Img, MatchesIndependentEvaluationWithShiftAndTermCounts) {
    RecordPtr psRF = RfSceneModel();
    double p = 0.0, l = 0.0, ep = 0.0, el = 0.0;
    for (int nTerms : {20, 10, 4, 1}) {
        psRF->nTerms = nTerms;
        RFGeo2Img(psRF.get(), 7.52, 46.91, 1020.0, &p, &l);
        ExpectedImage(*psRF, 7.52, 46.91, 1020.0, &ep, &el);
        EXPECT_NEAR(p, ep + 0.5, 1e-9) << nTerms;
        EXPECT_NEAR(l, el + 0.5, 1e-9) << nTerms;
    }
    // Without the shift the rational values come out unchanged; a null
    // height is taken as 0.
    psRF->nTerms = 20;
    psRF->nHalfPixelShift = 0;
    RFGeo2Img(psRF.get(), 7.4, 47.0, LUMO_NULL_VALUE, &p, &l);
    ExpectedImage(*psRF, 7.4, 47.0, 0.0, &ep, &el);
    EXPECT_NEAR(p, ep, 1e-9);
    EXPECT_NEAR(l, el, 1e-9);

    // No terms: the denominators vanish, so there is no image position.
    psRF->nTerms = 0;
    RFGeo2Img(psRF.get(), 7.4, 47.0, 0.0, &p, &l);
    EXPECT_EQ(p, LUMO_NULL_VALUE);
    EXPECT_EQ(l, LUMO_NULL_VALUE);
    // More than 20 terms evaluates the 20 that exist.
    RecordPtr psWide = AllocateRf(25);
    psWide->dfXScale = psWide->dfYScale = psWide->dfZScale = 1.0;
    psWide->dfPixelScale = psWide->dfLineScale = 1.0;
    psWide->padfPixelNum[1] = psWide->padfLineNum[2] = 1.0;
    psWide->padfPixelDen[0] = psWide->padfLineDen[0] = 1.0;
    psWide->padfPixelNum[22] = 1e9;  // beyond the model
    RFGeo2Img(psWide.get(), 3.0, 4.0, 0.0, &p, &l);
    EXPECT_DOUBLE_EQ(p, 3.5);
    EXPECT_DOUBLE_EQ(l, 4.5);
}

TEST(RFImg2Geo, StartingGuessAndHeightRules) {
    RecordPtr psRF = RfSceneModel();
    double p = 0.0, l = 0.0;
    RFGeo2Img(psRF.get(), 7.5, 46.9, 800.0, &p, &l);
    // X = 0 and Y = 0 start from the offsets; a null height becomes the
    // height offset and is written back.
    double x = 0.0, y = 0.0, z = LUMO_NULL_VALUE;
    ASSERT_EQ(RFImg2Geo(psRF.get(), p, l, &x, &y, &z), 1);
    EXPECT_EQ(z, 800.0);
    EXPECT_NEAR(x, 7.5, 1e-9);
    EXPECT_NEAR(y, 46.9, 1e-9);
    // A caller's good guess converges to the same point.
    x = 7.49;
    y = 46.91;
    ASSERT_EQ(RFImg2Geo(psRF.get(), p, l, &x, &y, &z), 1);
    EXPECT_NEAR(y, 46.9, 1e-9);
}

TEST(RFTransforms, AdjustmentReplacesTheHalfPixelShiftBothWays) {
    RecordPtr psRF = RfSceneModel();
    psRF->nAdjust = 1;
    const double a[6] = {1.5, 1e-4, -2e-4, 1e-9, 2e-9, -1e-9};
    const double b[6] = {-2.0, 3e-4, 1e-4, -1e-9, 1e-9, 3e-9};
    std::copy(a, a + 6, psRF->adfPixelAdjust);
    std::copy(b, b + 6, psRF->adfLineAdjust);
    double p = 0.0, l = 0.0, ep = 0.0, el = 0.0;
    RFGeo2Img(psRF.get(), 7.4, 46.99, 700.0, &p, &l);
    ExpectedImage(*psRF, 7.4, 46.99, 700.0, &ep, &el);
    const auto adjust = [&](const double* c) {
        return c[0] + c[1] * ep + c[2] * el + c[3] * ep * el + c[4] * ep * ep + c[5] * el * el;
    };
    EXPECT_NEAR(p, ep + adjust(a), 1e-8);  // no +0.5
    EXPECT_NEAR(l, el + adjust(b), 1e-8);
    // The inverse subtracts the adjustment evaluated at the given position,
    // which is not the exact inverse of the forward one: compare with that
    // rule computed here.
    const double P = 5000.0, L = 5000.0;
    const double pa = P - (a[0] + a[1] * P + a[2] * L + a[3] * P * L + a[4] * P * P + a[5] * L * L);
    const double la = L - (b[0] + b[1] * P + b[2] * L + b[3] * P * L + b[4] * P * P + b[5] * L * L);
    double x = LUMO_NULL_VALUE, y = LUMO_NULL_VALUE, z = 700.0;
    ASSERT_EQ(RFImg2Geo(psRF.get(), P, L, &x, &y, &z), 1);
    psRF->nAdjust = 0;
    psRF->nHalfPixelShift = 0;
    RFGeo2Img(psRF.get(), x, y, 700.0, &p, &l);
    EXPECT_NEAR(p, pa, 1e-5);
    EXPECT_NEAR(l, la, 1e-5);
}

TEST(RFTransforms, AntimeridianWrapsLongitudesIntoTheModelsSide) {
    RecordPtr psRF = RfSceneModel();
    double p1 = 0.0, l1 = 0.0, p2 = 0.0, l2 = 0.0;
    // East of 179 E, -179.05 is 180.95; west of 179 W, 179.05 is -180.95.
    for (const double dfSide : {1.0, -1.0}) {
        psRF->dfXOffset = 179.0 * dfSide;
        RFGeo2Img(psRF.get(), -179.05 * dfSide, 46.95, 800.0, &p1, &l1);
        RFGeo2Img(psRF.get(), 180.95 * dfSide, 46.95, 800.0, &p2, &l2);
        EXPECT_EQ(p1, p2);
        EXPECT_EQ(l1, l2);
        double x = LUMO_NULL_VALUE, y = LUMO_NULL_VALUE, z = 800.0;
        ASSERT_EQ(RFImg2Geo(psRF.get(), p1, l1, &x, &y, &z), 1);
        EXPECT_NEAR(x, 180.95 * dfSide, 1e-9);  // the model's side
        // The batch forms wrap alike.
        const double xw = -179.05 * dfSide, yw = 46.95, zw = 800.0;
        double pb = 0.0, lb = 0.0, xb = 0.0, yb = 0.0;
        RFGeo2ImgBatch(psRF.get(), 1, &xw, &yw, &zw, &pb, &lb, nullptr);
        EXPECT_NEAR(pb, p1, 1e-9);
        RFImg2GeoBatch(psRF.get(), 1, &p1, &l1, &zw, &xb, &yb, nullptr);
        EXPECT_NEAR(xb, 180.95 * dfSide, 1e-9);
    }
    // A model away from the antimeridian does not wrap.
    psRF->dfXOffset = 7.45;
    RFGeo2Img(psRF.get(), -7.0, 46.95, 800.0, &p1, &l1);
    ExpectedImage(*psRF, -7.0, 46.95, 800.0, &p2, &l2);
    EXPECT_NEAR(p1, p2 + 0.5, 1e-6);
}

TEST(RFNewton, StepSingularJacobianAndZeroDenominator) {
    RecordPtr psRF = RfSceneModel();
    // One step from the centre towards a target moves closer to it.
    double u = 9.0, v = 9.0;
    ASSERT_EQ(Newton(psRF.get(), 0.3, -0.2, 0.0, 0.0, 0.1, &u, &v), 1);
    double u2 = 0.0, v2 = 0.0;
    ASSERT_EQ(Newton(psRF.get(), 0.3, -0.2, u, v, 0.1, &u2, &v2), 1);
    EXPECT_LT(std::fabs(u2 - u), 0.05);
    // A model without first-order terms has a zero Jacobian at the centre.
    RecordPtr psFlat = AllocateRf(20);
    psFlat->dfXScale = psFlat->dfYScale = psFlat->dfZScale = 1.0;
    psFlat->dfPixelScale = psFlat->dfLineScale = 1.0;
    psFlat->padfPixelDen[0] = psFlat->padfLineDen[0] = 1.0;
    u = v = 42.0;
    EXPECT_EQ(Newton(psFlat.get(), 0.5, 0.5, 0.0, 0.0, 0.0, &u, &v), 0);
    EXPECT_EQ(u, 42.0);
    EXPECT_EQ(v, 42.0);
    // A vanishing denominator gives no step instead of NaN.
    psFlat->padfPixelNum[1] = psFlat->padfLineNum[2] = 1.0;
    psFlat->padfPixelDen[0] = 0.0;
    EXPECT_EQ(Newton(psFlat.get(), 0.5, 0.5, 0.0, 0.0, 0.0, &u, &v), 0);
    EXPECT_EQ(u, 42.0);
    // The inverse stops at the singular step; its estimate does not map back
    // onto the point, so it is a failure, not an answer.
    double x = LUMO_NULL_VALUE, y = LUMO_NULL_VALUE, z = 0.0;
    EXPECT_EQ(RFImg2Geo(psFlat.get(), 3.0, 3.0, &x, &y, &z), 0);
    EXPECT_EQ(x, LUMO_NULL_VALUE);
    EXPECT_EQ(y, LUMO_NULL_VALUE);
}

TEST(RFTransforms, UnusableRecordsAndInputsAreRefusedNotNaN) {
    lumo::support::WarningCapture quiet;
    RecordPtr psRF = RfSceneModel();
    psRF->dfYScale = 0.0;
    double p = 1.0, l = 1.0;
    RFGeo2Img(psRF.get(), 7.4, 47.0, 0.0, &p, &l);
    EXPECT_EQ(p, LUMO_NULL_VALUE);
    EXPECT_EQ(l, LUMO_NULL_VALUE);
    EXPECT_EQ(nova::GetLastErrorReport().nCode, 11);
    EXPECT_NE(nova::GetLastErrorReport().osText.find("dfYScale"), std::string::npos);
    double x = 5.0, y = 6.0, z = 0.0;
    EXPECT_EQ(RFImg2Geo(psRF.get(), 100.0, 100.0, &x, &y, &z), 0);
    EXPECT_EQ(x, LUMO_NULL_VALUE);
    psRF->dfYScale = std::nan("");
    EXPECT_EQ(RFImg2Geo(psRF.get(), 100.0, 100.0, &x, &y, &z), 0);
    psRF->dfYScale = 0.11;
    EXPECT_EQ(RFImg2Geo(psRF.get(), std::nan(""), 100.0, &x, &y, &z), 0);
    z = INFINITY;
    EXPECT_EQ(RFImg2Geo(psRF.get(), 100.0, 100.0, &x, &y, &z), 0);
    EXPECT_EQ(y, LUMO_NULL_VALUE);
    EXPECT_EQ(RFImg2Geo(nullptr, 100.0, 100.0, &x, &y, &z), 0);
    EXPECT_EQ(RFImg2Geo(psRF.get(), 100.0, 100.0, nullptr, &y, &z), 0);
    RFGeo2Img(nullptr, 1.0, 1.0, 1.0, &p, &l);
    EXPECT_EQ(p, LUMO_NULL_VALUE);
    EXPECT_GE(quiet.maoReports.size(), 7u);
}

}  // namespace
