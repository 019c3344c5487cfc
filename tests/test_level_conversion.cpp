// SPOT level 1A/1B conversion: identities, exact values against an
// independent evaluation, inverses of both polynomial forms, the per-line
// table of "SPOT5" scenes, the control-point form and the failure paths.
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <string>
#include <vector>

#include "lumo_srit.h"
#include "runtime.h"
#include "support/numbered_error.h"

namespace {

struct Point {
    double p;
    double l;
};

Point To1B(const SRITInfo_t* psModel, Point s) {
    SPOT1ATo1B_imp(psModel, &s.p, &s.l);
    return s;
}
Point To1A(const SRITInfo_t* psModel, Point s) {
    SPOT1BTo1A_imp(psModel, &s.p, &s.l);
    return s;
}

// A model record over a segment that lives in the fixture; the conversions
// only read the segment.
class LevelConversion : public ::testing::Test {
  protected:
    void SetUp() override {
        msModel.psEphemeris = &msSeg;
        std::strcpy(msSeg.szSensorName, "SPOT4_HRV");
    }

    double& K(int i) { return msSeg.adfLevelConvCoefs[i]; }
    void SetQ(int q0, int q1, int q2, int q3) {
        msSeg.anLevelConvParams[0] = q0;
        msSeg.anLevelConvParams[1] = q1;
        msSeg.anLevelConvParams[2] = q2;
        msSeg.anLevelConvParams[3] = q3;
    }
    // Attitude table with the given lines.
    void SetTable(std::vector<AttitudeLine_t> asLines) {
        masLines = std::move(asLines);
        msAttitude.nNumAttitudeLines = static_cast<int32_t>(masLines.size());
        msAttitude.pAttitudeLines = masLines.data();
        mpHolder = &msAttitude;
        msSeg.ppOrbitData = &mpHolder;
        msSeg.nOrbitType = EPH_ORBIT_ATTITUDE;
    }

    // What the "SPOT5" per-line table takes off a 1B to 1A conversion: the
    // result under a "SPOT4" name minus the result under a "SPOT5" one.
    Point TableShift(Point s) {
        std::strcpy(msSeg.szSensorName, "SPOT4_PAN");
        const Point sWithout = To1A(&msModel, s);
        std::strcpy(msSeg.szSensorName, "SPOT5_PAN_2");
        const Point sWith = To1A(&msModel, s);
        return {sWithout.p - sWith.p, sWithout.l - sWith.l};
    }

    // A form 39 polynomial whose line mapping is linear (exactly invertible)
    // and whose pixel mapping has non-linear numerator and denominator terms
    // in the normalised line.
    void SetRatioForm() {
        msSeg.nLevelConvForm = 39;
        SetQ(3, 5, 7, 11);
        K(0) = 100.0, K(1) = 2.0, K(2) = 50.0, K(3) = 4.0;
        K(4) = 10.0, K(5) = 3.0, K(6) = 20.0, K(7) = 5.0;
        K(9) = 1.0;   // m = normalised line
        K(15) = 1.0;  // cubic in pixel: identity
        K(18) = 1.0, K(19) = 0.01, K(20) = 0.001, K(21) = 1e-5, K(22) = 1e-7;  // denominator
        K(23) = 0.5, K(24) = 0.02, K(25) = 0.003, K(26) = 1e-4, K(27) = 2e-6, K(28) = 1e-8;
        K(30) = 1.0;  // inverse of the line mapping
        K(36) = 1.0;  // inverse of the pixel cubic
    }

    SRITInfo_t msModel{};
    EphemerisSeg_t msSeg{};
    AttitudeData_t msAttitude{};
    void* mpHolder = nullptr;
    std::vector<AttitudeLine_t> masLines;
};

const Point kPoints[] = {
    {0.0, 0.0}, {1.0, 1.0}, {2999.5, 1500.25}, {-12.0, 6000.0}, {5999.0, 3.75}};

// 1A -> 1B -> 1A and 1B -> 1A -> 1B give the points back.
void ExpectRoundTrips(const SRITInfo_t* psModel, double dfTol) {
    for (const Point& s : kPoints) {
        for (const Point& sBack :
             {To1A(psModel, To1B(psModel, s)), To1B(psModel, To1A(psModel, s))}) {
            EXPECT_NEAR(sBack.p, s.p, dfTol);
            EXPECT_NEAR(sBack.l, s.l, dfTol);
        }
    }
}

TEST_F(LevelConversion, OtherFormsLeaveCoordinatesUnchanged) {
    for (int i = 0; i < EPH_LEVEL_COEF_COUNT; ++i) K(i) = 3.0 + i;
    SetQ(4, 5, 6, 7);
    const EphemerisSeg_t* apsSegs[] = {&msSeg};
    for (int nForm : {0, 1, 19, 21, 38, 40, -20}) {
        msSeg.nLevelConvForm = nForm;
        for (const Point& s : kPoints) {
            Point sC = s;
            SPOT1BTo1AControlPoint_imp(apsSegs, 0, &sC.p, &sC.l);
            for (const Point& sOut : {To1B(&msModel, s), To1A(&msModel, s), sC}) {
                EXPECT_EQ(sOut.p, s.p);
                EXPECT_EQ(sOut.l, s.l);
            }
        }
    }
    // A record without a segment, null records and null outputs are left alone.
    msSeg.nLevelConvForm = 20;
    SRITInfo_t sEmpty{};
    double dfPixel = 4.0, dfLine = 5.0;
    SPOT1ATo1B_imp(&sEmpty, &dfPixel, &dfLine);
    SPOT1BTo1A_imp(nullptr, &dfPixel, &dfLine);
    SPOT1ATo1B_imp(&msModel, nullptr, &dfLine);
    SPOT1BTo1A_imp(&msModel, &dfPixel, nullptr);
    SPOT1BTo1AControlPoint_imp(nullptr, 0, &dfPixel, &dfLine);
    SPOT1BTo1AControlPoint_imp(apsSegs, -1, &dfPixel, &dfLine);
    const EphemerisSeg_t* apsNull[] = {nullptr};
    SPOT1BTo1AControlPoint_imp(apsNull, 0, &dfPixel, &dfLine);
    EXPECT_EQ(dfPixel, 4.0);
    EXPECT_EQ(dfLine, 5.0);
}

TEST_F(LevelConversion, CubicFormExactValuesAndInverse) {
    msSeg.nLevelConvForm = 20;
    // Full cubics against a term-by-term evaluation with std::pow.
    for (int i = 0; i < 20; ++i) K(i) = 0.5 + 0.25 * i;
    K(2) = 1e-4, K(3) = -2e-8, K(6) = 3e-5, K(7) = 1e-9, K(18) = -1e-5, K(19) = 4e-9;
    K(10) = 2e-5, K(11) = 1e-9, K(14) = -3e-5, K(15) = 5e-10;
    auto fnCubic = [&](double v, int k) {
        return K(k) + K(k + 1) * v + K(k + 2) * std::pow(v, 2) + K(k + 3) * std::pow(v, 3);
    };
    for (const Point& s : kPoints) {
        const double dfLine1B = fnCubic(s.l, 0);
        const Point sB = To1B(&msModel, s);
        EXPECT_NEAR(sB.l, dfLine1B, 1e-9 * (1.0 + std::fabs(dfLine1B)));
        const double dfPixel1B = fnCubic(dfLine1B, 16) + fnCubic(s.p, 4);
        EXPECT_NEAR(sB.p, dfPixel1B, 1e-9 * (1.0 + std::fabs(dfPixel1B)));
        const Point sA = To1A(&msModel, s);
        const double dfPixel1A = fnCubic(s.p - fnCubic(s.l, 16), 12);
        EXPECT_NEAR(sA.l, fnCubic(s.l, 8), 1e-9 * (1.0 + std::fabs(sA.l)));
        EXPECT_NEAR(sA.p, dfPixel1A, 1e-9 * (1.0 + std::fabs(dfPixel1A)));
    }

    // Linear forward terms with their exact inverse: both ways round trip.
    for (int i = 0; i < EPH_LEVEL_COEF_COUNT; ++i) K(i) = 0.0;
    const double a = 12.5, b = 1.25, c = -7.0,
                 d = 0.98;  // l' = a + b l, p' = (3 + 0.01 l') + (c + d p)
    K(0) = a, K(1) = b, K(16) = 3.0, K(17) = 0.01, K(4) = c, K(5) = d;
    K(8) = -a / b, K(9) = 1.0 / b, K(12) = -c / d, K(13) = 1.0 / d;
    ExpectRoundTrips(&msModel, 1e-9);
}

TEST_F(LevelConversion, RatioFormExactValuesAndInverse) {
    SetRatioForm();
    // Independent evaluation of the 1A to 1B formula for one point.
    const Point s{1234.5, 678.25};
    const double dfNormLine = (s.l + 5 - 1 - 10.0) / 3.0;
    const double dfNormPixel = (s.p + 3 - 1 - 20.0) / 5.0;
    const double dfM = dfNormLine;
    double dfNum = 0.0, dfDen = 0.0;
    for (int i = 0; i <= 5; ++i) dfNum += K(23 + i) * std::pow(dfM, i);
    for (int i = 0; i <= 4; ++i) dfDen += K(18 + i) * std::pow(dfM, i);
    const Point sExpected{(dfNum + dfNormPixel) / dfDen * 4.0 + 50.0 - 7 + 1,
                          100.0 + 2.0 * dfM - 11 + 1};
    const Point sB = To1B(&msModel, s);
    EXPECT_NEAR(sB.p, sExpected.p, 1e-9 * std::fabs(sExpected.p));
    EXPECT_NEAR(sB.l, sExpected.l, 1e-12 * std::fabs(sExpected.l));

    ExpectRoundTrips(&msModel, 1e-8);
    // The exported entry points give the implementation's results.
    Point sEntry = s;
    SPOT1ATo1B(&msModel, &sEntry.p, &sEntry.l);
    EXPECT_EQ(sEntry.p, sB.p);
    SPOT1BTo1A(&msModel, &sEntry.p, &sEntry.l);
    EXPECT_EQ(sEntry.l, To1A(&msModel, sB).l);
}

TEST_F(LevelConversion, Spot5PerLineTable) {
    SetRatioForm();
    msSeg.nNumLines = 4;
    // A constant table: the conversions stay exact inverses, and the forward
    // shift equals the table values carried through the linear mapping.
    SetTable({{0.25, -0.5}, {0.25, -0.5}, {0.25, -0.5}, {0.25, -0.5}});
    const Point s{1000.0, 2.5};
    const Point sPlain = To1B(&msModel, s);
    std::strcpy(msSeg.szSensorName, "spot5_pan_5");  // case is ignored
    const Point sShifted = To1B(&msModel, s);
    EXPECT_NEAR(sShifted.l - sPlain.l, 2.0 * -0.5 / 3.0, 1e-12);
    const Point sBack = To1A(&msModel, sShifted);
    EXPECT_NEAR(sBack.p, s.p, 1e-8);
    EXPECT_NEAR(sBack.l, s.l, 1e-8);

    // The entry comes from the input line, clamped to the image.
    SetTable({{1.0, 10.0}, {2.0, 20.0}, {3.0, 30.0}, {4.0, 40.0}});
    const struct {
        double dfLine;
        int nEntry;
    } asCases[] = {{-3.7, 0}, {-0.5, 0},  {0.0, 0}, {0.99, 0},   {1.0, 1},
                   {2.9, 2},  {3.999, 3}, {4.0, 3}, {1000.0, 3}, {-50.0, 0}};
    for (const auto& sCase : asCases) {
        const Point sShift = TableShift({500.0, sCase.dfLine});
        EXPECT_DOUBLE_EQ(sShift.p, masLines[sCase.nEntry].dfValue1) << sCase.dfLine;
        EXPECT_DOUBLE_EQ(sShift.l, masLines[sCase.nEntry].dfValue2) << sCase.dfLine;
    }
    // Counts that disagree: an image longer than its table uses the table's
    // last entry; a segment without a line count is bounded by the table.
    for (int nNumLines : {100, 0, -5}) {
        msSeg.nNumLines = nNumLines;
        EXPECT_DOUBLE_EQ(TableShift({500.0, 50.0}).l, 40.0) << nNumLines;
    }
    // A table whose array is missing is no table.
    msSeg.nNumLines = 4;
    msAttitude.pAttitudeLines = nullptr;
    const Point sNoArray = TableShift({500.0, 2.0});
    EXPECT_EQ(sNoArray.p, 0.0);
    EXPECT_EQ(sNoArray.l, 0.0);
    msAttitude.pAttitudeLines = masLines.data();
    // A NaN line reads entry 0 and stays NaN.
    EXPECT_TRUE(std::isnan(To1B(&msModel, {500.0, std::nan("")}).l));
}

TEST_F(LevelConversion, ControlPointFormUsesItsImageAndNoTable) {
    SetRatioForm();
    std::strcpy(msSeg.szSensorName, "SPOT5_PAN_5");
    msSeg.nNumLines = 2;
    SetTable({{7.0, 70.0}, {8.0, 80.0}});
    EphemerisSeg_t sCubic{};
    sCubic.nLevelConvForm = 20;
    sCubic.adfLevelConvCoefs[8] = 2.0;  // l' = 2 + 3 l
    sCubic.adfLevelConvCoefs[9] = 3.0;
    sCubic.adfLevelConvCoefs[13] = 1.0;  // p' = p
    const EphemerisSeg_t* apsSegs[] = {&sCubic, &msSeg};

    // Image 1: the 1B to 1A conversion of its segment without the table.
    Point sCp{321.0, 1.0};
    SPOT1BTo1AControlPoint_imp(apsSegs, 1, &sCp.p, &sCp.l);
    std::strcpy(msSeg.szSensorName, "SPOT4_PAN");
    const Point sExpected = To1A(&msModel, {321.0, 1.0});
    EXPECT_EQ(sCp.p, sExpected.p);
    EXPECT_EQ(sCp.l, sExpected.l);
    // Image 0: its own cubic segment.
    Point sCp0{321.0, 1.0};
    SPOT1BTo1AControlPoint_imp(apsSegs, 0, &sCp0.p, &sCp0.l);
    EXPECT_EQ(sCp0.p, 321.0);
    EXPECT_EQ(sCp0.l, 5.0);
}

// Expects fatal error 100 whose text contains `osPart`, and the point unchanged.
template <typename Fn>
void ExpectConversionError(Fn fnConvert, Point s, const std::string& osPart) {
    Point sOut = s;
    const auto sError = lumo::support::FatalOf([&] { fnConvert(&sOut.p, &sOut.l); });
    EXPECT_EQ(sError.first, 100) << osPart;
    EXPECT_NE(sError.second.find(osPart), std::string::npos) << sError.second;
    EXPECT_EQ(sOut.p, s.p);
    EXPECT_EQ(sOut.l, s.l);
}

TEST_F(LevelConversion, DegenerateCoefficientsAreFatalErrors) {
    const auto fnTo1B = [&](double* p, double* l) { SPOT1ATo1B_imp(&msModel, p, l); };
    const auto fnTo1A = [&](double* p, double* l) { SPOT1BTo1A_imp(&msModel, p, l); };
    const EphemerisSeg_t* apsSegs[] = {&msSeg};
    const auto fnControl = [&](double* p, double* l) {
        SPOT1BTo1AControlPoint_imp(apsSegs, 0, p, l);
    };
    // Zero scale coefficients of form 39 name the coefficient.
    for (int nIndex : {5, 7}) {
        SetRatioForm();
        K(nIndex) = 0.0;
        ExpectConversionError(fnTo1B, {10.0, 20.0}, "coefficient " + std::to_string(nIndex));
    }
    for (int nIndex : {1, 3}) {
        SetRatioForm();
        K(nIndex) = nIndex == 1 ? 0.0 : std::nan("");
        ExpectConversionError(fnTo1A, {10.0, 20.0}, "coefficient " + std::to_string(nIndex));
        ExpectConversionError(fnControl, {10.0, 20.0}, "coefficient " + std::to_string(nIndex));
    }
    // A denominator that vanishes at the point names the point.
    SetRatioForm();
    K(18) = -1.0, K(19) = 1.0, K(20) = K(21) = K(22) = 0.0;  // zero where m = 1
    const double dfLineAtM1 = 3.0 + 10.0 - 5 + 1;            // (L - K4) / K5 = 1
    ExpectConversionError(fnTo1B, {10.0, dfLineAtM1}, "line 9 gives");
    // Cubic form overflow.
    msSeg.nLevelConvForm = 20;
    for (int i = 0; i < EPH_LEVEL_COEF_COUNT; ++i) K(i) = 1.0;
    ExpectConversionError(fnTo1B, {1e200, 1e200}, "no finite result");
}

}  // namespace
