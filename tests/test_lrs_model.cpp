// Low-resolution orbit model: set-up from simulated AVHRR passes, state
// table, image and ground mapping, refinement, dispatch and the model
// object, and the refusal of bad segments.
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "avhrr_sim.h"
#include "lumo.h"
#include "runtime.h"
#include "support/avhrr_pass.h"
#include "support/numbered_error.h"

namespace {

using lumo::sim::AvhrrPassSpec;

using lumo::support::SegmentPtr;
using Pass = lumo::support::AvhrrPass;

AvhrrData_t& Header(EphemerisSeg_t& seg) {
    return *static_cast<AvhrrData_t*>(*seg.ppOrbitData);
}

// Largest image distance (pixels) between two models over a grid of points
// at heights of 0 to 2 km: ground from `from`, image from `to`.
double ImageDisagreement(const LRSOrbitModel_t& from, const LRSOrbitModel_t& to, int nSteps) {
    double dfWorst = 0.0;
    for (int i = 0; i <= nSteps; ++i) {
        for (int j = 0; j <= nSteps; ++j) {
            const double p = 10.0 + 2028.0 * i / nSteps,
                         l = 5.0 + (from.nNumScanLines - 10.0) * j / nSteps;
            const double h = 2000.0 * ((i + j) % 3) / 2.0;
            double lon = 0, lat = 0, p2 = 0, l2 = 0;
            EXPECT_EQ(LRSImageToGeodeticAtHeight(&from, p, l, h, &lon, &lat), 1);
            EXPECT_EQ(LRSGeodeticToImage(&to, lon, lat, h, &p2, &l2), 1) << p << " " << l;
            dfWorst = std::max(dfWorst, std::hypot(p2 - p, l2 - l));
        }
    }
    return dfWorst;
}

// Moves every scan line's time code by nDays days.
void ShiftTimeCodeDays(EphemerisSeg_t& seg, int nDays) {
    for (int k = 0; k < Header(seg).nNumScanLines; ++k)
        Header(seg).pScanLines[k].abyTimeCode[1] += nDays;
}

double RotationAngle(const double* A, const double* B) {
    double trace = 0.0;  // of A^T B
    for (int k = 0; k < 9; ++k) trace += A[k] * B[k];
    return std::acos(std::clamp((trace - 1.0) / 2.0, -1.0, 1.0));
}

TEST(OrbitModel, SetUpFromASimulatedPass) {
    Pass forward;
    const LRSOrbitModel_t& m = forward.oModel;
    EXPECT_EQ(m.nEpochYear, 2004);
    EXPECT_DOUBLE_EQ(m.dfEpochSecOfYear, 166 * 86400.0 + 36000.0);
    EXPECT_NEAR(m.dfTimeOrigin, 300.0, 1e-4);
    EXPECT_NEAR(m.dfTimeEnd, 300.0 + 2400 / 6.0, 1e-3);
    EXPECT_EQ(m.nNumScanLines, 2400);
    EXPECT_NEAR(m.adfMeanElements[LRS_ELEM_I], 98.75 * 3.141592653589793 / 180.0, 1e-12);
    // The same pass with its scan lines stored backwards is the image turned
    // half way round: (p, l) there is (2048 - p, N - l) here, at the same
    // time and scan angle.
    AvhrrPassSpec sBackward;
    sBackward.bBackward = true;
    Pass backward(sBackward);
    EXPECT_NEAR(backward.oModel.dfTimeOrigin, m.dfTimeOrigin, 1e-4);
    for (double p : {0.5, 700.0, 2047.5}) {
        for (double l : {0.5, 1234.5, 2399.5}) {
            double lon1, lat1, lon2, lat2;
            ASSERT_EQ(LRSImageToGeodetic(&forward.oModel, p, l, &lon1, &lat1), 1);
            ASSERT_EQ(LRSImageToGeodetic(&backward.oModel, 2048 - p, 2400 - l, &lon2, &lat2), 1);
            EXPECT_NEAR(lon1, lon2, 1e-7);
            EXPECT_NEAR(lat1, lat2, 1e-7);
        }
    }
    // Copies are deep and carry the tables; deleting the tables keeps the set-up.
    LRSSetupOrbitModelForAngleGeneration(&backward.oModel);
    std::unique_ptr<LRSOrbitModel_t> pClone(backward.oModel.Clone());
    ASSERT_NE(pClone->padfStates, nullptr);
    EXPECT_NE(pClone->padfStates, backward.oModel.padfStates);
    EXPECT_EQ(pClone->apadfAngleGrids[4][7], backward.oModel.apadfAngleGrids[4][7]);
    LRSDeleteOrbitModel(pClone.get());
    EXPECT_EQ(pClone->padfStates, nullptr);
    EXPECT_EQ(pClone->nGridCols, 0);
    EXPECT_EQ(pClone->nNumStates, backward.oModel.nNumStates);
}

// The set-up's printed messages and the time corrections behind them.
TEST(OrbitModel, SetUpHandlesEpochAndTimeCodeDefects) {
    struct Case {
        const char* pszName;
        std::function<void(EphemerisSeg_t&)> fnEdit;
        const char* pszMessage;  // expected on standard output, or ""
        double dfStart;          // expected dfTimeOrigin
    };
    const double dfNormal = 300.0;
    const Case aCases[] = {
        {"stored epoch ms disagrees",
         [](EphemerisSeg_t& s) { std::strcpy(Header(s).szEpochMsOfDay, "123"); },
         "appears to be invalid. Using derived value, 36000000", dfNormal},
        {"time codes a day from the acquisition date",
         [](EphemerisSeg_t& s) { ShiftTimeCodeDays(s, 1); }, "", dfNormal + 86400.0},
        {"time codes three days off", [](EphemerisSeg_t& s) { ShiftTimeCodeDays(s, 3); },
         "Using GMT time instead of satellite timecodes", dfNormal},
        {"GMT times across midnight",
         [](EphemerisSeg_t& s) {
             AvhrrData_t& h = Header(s);
             std::memset(h.pScanLines[0].abyTimeCode, 0, 7);  // unusable codes
             h.pScanLines[0].nTimeMs = 86400000 - 100000;
             h.pScanLines[h.nNumScanLines - 1].nTimeMs = 300000;
         },
         "crosses over 0h GMT", 86400.0 - 100.0 - 36000.0},
    };
    for (const Case& c : aCases) {
        SegmentPtr pSeg(lumo::sim::MakeAvhrrSegment(AvhrrPassSpec()));
        c.fnEdit(*pSeg);
        LRSOrbitModel_t m;
        testing::internal::CaptureStdout();
        LRSInitOrbitModel(pSeg.get(), &m);
        const std::string osOut = testing::internal::GetCapturedStdout();
        EXPECT_TRUE(*c.pszMessage ? osOut.find(c.pszMessage) != std::string::npos : osOut.empty())
            << c.pszName << ": " << osOut;
        EXPECT_NEAR(m.dfTimeOrigin, c.dfStart, 1e-3) << c.pszName;
        EXPECT_GT(m.dfTimeEnd, m.dfTimeOrigin) << c.pszName;
    }
    // A pass over New Year: the time codes restart at day 1, the pass stays
    // continuous and close to its epoch on day 366 of 2004.
    AvhrrPassSpec sNewYear;
    sNewYear.nEpochDay = 366;
    sNewYear.dfEpochSecondOfDay = 86400.0 - 200.0;
    sNewYear.dfStartSeconds = 0.0;
    Pass newYear(sNewYear, false);
    EXPECT_NEAR(newYear.oModel.dfTimeOrigin, 0.0, 1e-3);
    EXPECT_NEAR(newYear.oModel.dfTimeEnd, 2400 / 6.0, 1e-3);
}

TEST(OrbitModel, RefusesSegmentsItCannotModel) {
    const std::pair<const char*, std::function<void(EphemerisSeg_t&)>> aCases[] = {
        {"nOrbitType", [](EphemerisSeg_t& s) { s.nOrbitType = 0; }},
        {"nNumScanLines", [](EphemerisSeg_t& s) { Header(s).nNumScanLines = 1; }},
        {"szSemiMajorAxis",
         [](EphemerisSeg_t& s) { std::strcpy(Header(s).szSemiMajorAxis, "72x9860"); }},
        {"szSemiMajorAxis",
         [](EphemerisSeg_t& s) { std::strcpy(Header(s).szSemiMajorAxis, "6000000"); }},
        {"szEccentricity", [](EphemerisSeg_t& s) { std::strcpy(Header(s).szEccentricity, ""); }},
        {"szClockOffset", [](EphemerisSeg_t& s) { std::strcpy(Header(s).szClockOffset, "1.5.3"); }},
        {"szEpochYearDay",
         [](EphemerisSeg_t& s) { std::strcpy(Header(s).szEpochYearDay, "2003366"); }},
        {"szEpochHour", [](EphemerisSeg_t& s) { std::strcpy(Header(s).szEpochHour, "24"); }},
        {"abyTimeCode[2]", [](EphemerisSeg_t& s) { Header(s).pScanLines[0].abyTimeCode[2] = 24; }},
        {"apart", [](EphemerisSeg_t& s) { Header(s).pScanLines[2399].abyTimeCode[0] += 1; }},
        {"nNumLines",
         [](EphemerisSeg_t& s) {
             std::strcpy(s.szSensorName, "NOAA");
             s.nNumLines = 1;
         }},
        {"dfOrbitRadius",
         [](EphemerisSeg_t& s) {
             std::strcpy(s.szSensorName, "NOAA");
             s.nNumLines = 10;
             s.dfOrbitRadius = NAN;
         }},
    };
    for (const auto& [pszField, fnEdit] : aCases) {
        SegmentPtr pSeg(lumo::sim::MakeAvhrrSegment(AvhrrPassSpec()));
        const int32_t nKind = pSeg->nOrbitType;
        fnEdit(*pSeg);
        Pass kept;  // a model that must survive the refusal unchanged
        const double dfOrigin = kept.oModel.dfTimeOrigin;
        testing::internal::CaptureStdout();
        const std::string osText =
            lumo::support::FatalOf([&] { LRSInitOrbitModel(pSeg.get(), &kept.oModel); }).second;
        testing::internal::GetCapturedStdout();
        pSeg->nOrbitType = nKind;  // the release frees the sub-record by its kind
        EXPECT_NE(osText.find(pszField), std::string::npos) << pszField << ": " << osText;
        EXPECT_EQ(kept.oModel.dfTimeOrigin, dfOrigin);
        EXPECT_NE(kept.oModel.padfStates, nullptr);
    }
}

TEST(OrbitModel, StateTableFollowsTheDirectComputation) {
    for (double dfInc : {98.75, 90.0}) {  // 90: pitch +-90 degrees at the equator
        AvhrrPassSpec s;
        s.dfInclination = dfInc;
        s.dfMeanAnomaly = 250.0;  // the pass crosses the equator
        s.nLines = 6000;
        Pass pass(s);
        double dfPos = 0.0, dfRot = 0.0;
        for (double t = -140.0; t < 1100.0; t += 0.37) {
            double p1[3], R1[9], p2[3], R2[9];
            GetEcrOrbitState(&pass.oModel, t, p1, R1);
            CalcEcrOrbitState(&pass.oModel, t, p2, R2);
            dfPos = std::max(dfPos, std::hypot(p1[0] - p2[0], p1[1] - p2[1], p1[2] - p2[2]));
            dfRot = std::max(dfRot, RotationAngle(R1, R2));
        }
        EXPECT_LT(dfPos, 2e-3) << dfInc;  // km: linear interpolation over a second
        EXPECT_LT(dfRot, 1e-7) << dfInc;  // rad
        // Unrefined, the sensor's z axis points at the Earth's centre; past
        // the table the last entry stands.
        double pos[3], R[9], last[3], Rl[9];
        CalcEcrOrbitState(&pass.oModel, 100.0, pos, R);
        for (int k = 0; k < 3; ++k) EXPECT_NEAR(R[3 * k + 2], -pos[k] / VecLength(pos), 1e-12);
        GetEcrOrbitState(&pass.oModel, pass.oModel.dfLastStateTime + 1000.0, pos, R);
        GetEcrOrbitState(&pass.oModel, pass.oModel.dfLastStateTime, last, Rl);
        EXPECT_EQ(pos[0], last[0]);
    }
    // Yaw from +3.1 to -3.1 rad turns the short way, through +-pi.
    Pass pass;
    double* e = pass.oModel.padfStates;
    const double adfA[3] = {0.0, 0.0, 3.1}, adfB[3] = {0.0, 0.0, -3.1};
    std::copy(adfA, adfA + 3, e + 3);
    std::copy(adfB, adfB + 3, e + LRS_STATE_SIZE + 3);
    double pos[3], R[9], Rpi[9];
    GetEcrOrbitState(&pass.oModel, pass.oModel.dfFirstStateTime + 0.5, pos, R);
    AttitudeMatrix(0.0, 0.0, 3.141592653589793, Rpi);
    EXPECT_LT(RotationAngle(R, Rpi), 1e-12);
    EXPECT_DOUBLE_EQ(UnwrapAngle(3.5), 3.5 - 2.0 * 3.141592653589793);
}

TEST(OrbitModel, ImageAndGroundRoundTrips) {
    // The family property test runs the forward pass; here one stored
    // backwards on another inclination.
    AvhrrPassSpec sBackward;
    sBackward.bBackward = true;
    sBackward.dfInclination = 70.0;
    const Pass backward(sBackward);
    EXPECT_LT(ImageDisagreement(backward.oModel, backward.oModel, 8), 0.01);
    Pass pass;
    // The Earth's far side is not in the image.
    double p = 5.0, l = 5.0;
    EXPECT_EQ(LRSGeodeticToImage(&pass.oModel, -170.0, -45.0, 0.0, &p, &l), 0);
    EXPECT_EQ(p, 0.0);
    EXPECT_EQ(l, -10000.0);
    EXPECT_EQ(LRSGeodeticToImage(&pass.oModel, 0.0, 95.0, 0.0, &p, &l), 0);
    // The scan angle 0 looks at the Earth's centre.
    const double dfNadirPixel =
        pass.oModel.sSensor.dfRefPixel -
        pass.oModel.sSensor.dfScanAngle0 / pass.oModel.sSensor.dfScanAngleStep;
    double sat[3], ground[3], cross[3];
    LRSSatelliteXYZ(&pass.oModel, dfNadirPixel, 1000.0, sat);
    ASSERT_EQ(ImageToEcr(&pass.oModel, dfNadirPixel, 1000.0, ground), 1);
    CrossProduct(sat, ground, cross);
    EXPECT_LT(VecLength(cross) / (VecLength(sat) * VecLength(ground)), 1e-9);
    // Ellipsoid primitives.
    double pos[3] = {7000.0, 0.0, 0.0}, dir[3] = {-1.0, 0.0, 0.0}, hit[3];
    ASSERT_EQ(EcrIntersection(pos, dir, hit), 1);
    EXPECT_NEAR(hit[0], LRS_ELLIPSOID_A, 1e-9);
    double dir2[3] = {0.0, 1.0, 0.0};
    EXPECT_EQ(EcrIntersection(pos, dir2, hit), 0);
    double lon, lat, h;
    double pole[3] = {0.0, 0.0, LRS_ELLIPSOID_B};
    EcrToGeodetic2(pole, &lon, &lat, &h);
    EXPECT_NEAR(lat, 90.0, 1e-12);
    EXPECT_NEAR(h, 0.0, 1e-9);
}

// A pass whose true roll is 0.1 degree off and which runs 2 km ahead of the
// nominal orbit; 20 control points of the true pass refine the nominal model.
TEST(OrbitModel, RefinementRecoversAttitudeAndOrbitBiases) {
    Pass truth, nominal(AvhrrPassSpec(), false);
    lumo::sim::AvhrrBias sBias;
    sBias.dfRollDeg = 0.1;
    sBias.dfAlongTrackKm = 2.0;
    lumo::sim::ApplyBias(sBias, &truth.oModel);
    LRSSetupCoordinateMapping(&truth.oModel);
    std::vector<ControlPoint_t> asGcps =
        lumo::sim::SampleAvhrrPoints(truth.oModel, 5, 4, 40.0, 2000.0, 7);
    ASSERT_EQ(asGcps.size(), 20U);

    LRSSetupCoordinateMapping(&nominal.oModel);  // a table does not hide the refinement
    const double dfBefore = ImageDisagreement(truth.oModel, nominal.oModel, 6);
    LRSRefineOrbitModel(&nominal.oModel, asGcps.data(), 20);
    LRSSetupCoordinateMapping(&nominal.oModel);
    const double dfAfter = ImageDisagreement(truth.oModel, nominal.oModel, 10);
    EXPECT_GT(dfBefore, 2.0);
    EXPECT_LT(dfAfter, 0.5);
    EXPECT_EQ(nominal.oModel.asControlPoints.size(), 20U);

    // The five-array form gives the same refinement.
    Pass again(AvhrrPassSpec(), false);
    std::vector<double> x, y, z, lon, lat;
    for (const ControlPoint_t& c : asGcps) {
        x.push_back(c.dfImageX), y.push_back(c.dfImageY), z.push_back(c.dfGroundZ);
        lon.push_back(c.dfGroundX), lat.push_back(c.dfGroundY);
    }
    LRSRefine(&again.oModel, 20, x.data(), y.data(), z.data(), lon.data(), lat.data());
    EXPECT_EQ(again.oModel.adfRollPoly[1], nominal.oModel.adfRollPoly[1]);
    EXPECT_EQ(again.oModel.adfOrbitCorr[1], nominal.oModel.adfOrbitCorr[1]);

    // A point already on its line of sight changes nothing; a bad one is
    // refused and the model kept.
    Pass exact(AvhrrPassSpec(), false);
    ControlPoint_t sOn{1000.0, 700.0, 0.0, 0.0, 0.0};
    ASSERT_EQ(LRSImageToGeodetic(&exact.oModel, 1000.0, 700.0, &sOn.dfGroundX, &sOn.dfGroundY), 1);
    LRSRefineOrbitModel(&exact.oModel, &sOn, 1);
    EXPECT_NEAR(exact.oModel.adfRollPoly[1], 0.0, 1e-12);
    ControlPoint_t sBad = sOn;
    sBad.dfGroundY = 95.0;
    EXPECT_THROW(LRSRefineOrbitModel(&exact.oModel, &sBad, 1), nova::NumberedError);
    EXPECT_EQ(exact.oModel.asControlPoints.size(), 1U);
}

// Round trips, heights, failure values and the array form are the family
// property test's; here what is the orbit model's own.
TEST(OrbitModel, DispatchAndModelObject) {
    Pass pass;
    void* pModel = &pass.oModel;
    double lon = 0, lat = 0, z = 1500.0;
    ASSERT_EQ(GenImg2GeoDem(LUMO_CODE_LRS, pModel, 600.0, 900.0, &z, &lon, &lat), 1);
    EXPECT_EQ(z, 1500.0);

    nova::mathmodel::LumoMathModel oObject(nova::mathmodel::LUMO_MODEL_LRS, &pass.oModel);
    std::unique_ptr<nova::mathmodel::IMathModel> pClone(oObject.Clone());
    double p2 = 0, l2 = 0;
    ASSERT_EQ(pClone->GroundToImage(lon, lat, 1500.0, p2, l2, false), 0);
    EXPECT_NEAR(p2, 600.0, 0.01);
    EXPECT_NEAR(l2, 900.0, 0.01);
    EXPECT_THROW(oObject.GetNumColumns(), nova::ParameterException);
}

}  // namespace
