// Rigorous model computation, transforms and residuals: sensor rows, failure
// paths, exact properties of the transforms, and agreement with the scene
// simulator's truth.
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "lumo_dispatch.h"
#include "lumo_ephemeris.h"
#include "lumo_mathmodel.h"
#include "lumo_sim.h"
#include "lumo_srit.h"
#include "lumo_trn.h"
#include "runtime.h"
#include "support/model_records.h"
#include "support/sim_gcps.h"

namespace {

using lumo::sim::Scene;
using lumo::sim::SceneParams;
using lumo::sim::SimPoint;

using ModelPtr = lumo::support::SritPtr;
using lumo::support::SegmentPtr;
using Gcps = lumo::support::SimGcps;

int Calculate(SRITInfo_t* psModel, EphemerisSeg_t* psSeg, const ProjInfo_t& sProj, const Gcps& g) {
    return SRITCalculate(psModel, true, psSeg, g.Count(), &sProj, g.p.data(), g.l.data(),
                         g.z.data(), g.x.data(), g.y.data());
}

// Fits a model to a simulated scene with the given sensor name.
ModelPtr FitNamed(const char* pszSensor, int nPoints, double dfRoll = 0.0) {
    SceneParams s;
    s.osSensorName = pszSensor;
    s.dfRollDeg = dfRoll;
    const Scene sScene(s);
    const Gcps g(sScene.SamplePoints(nPoints, 5, 0.0, 2000.0));
    ModelPtr psModel(SRITAllocate());
    EXPECT_EQ(Calculate(psModel.get(), sScene.MakeSegment(), sScene.Projection(), g), 1);
    return psModel;
}

int NumberedErrorCode(const std::function<void()>& fn) {
    try {
        fn();
    } catch (const nova::NumberedError& e) {
        return e.GetCode();
    }
    return 0;
}

TEST(SRITCalculate, FillsTheRecordFromTheSegmentAndAdoptsIt) {
    SceneParams s;
    const Scene sScene(s);
    const Gcps g(sScene.SamplePoints(9, 3, 0.0, 1500.0));
    ModelPtr psModel(SRITAllocate());
    EphemerisSeg_t* psSeg = sScene.MakeSegment();
    ASSERT_EQ(Calculate(psModel.get(), psSeg, sScene.Projection(), g), 1);
    EXPECT_EQ(psModel->psEphemeris, psSeg);  // adopted, not copied
    EXPECT_STREQ(psModel->Sensor, "SPOT5_PAN_5");
    EXPECT_EQ(psModel->nSensor, 55);
    EXPECT_EQ(psModel->nModelClass, 1);
    EXPECT_STREQ(psModel->psProjInfo->szProj, sScene.Projection().szProj);
    const double* c = psModel->adfCoef;
    EXPECT_DOUBLE_EQ(c[2], s.dfIFOV);
    EXPECT_DOUBLE_EQ(c[4], 6000.0);
    EXPECT_DOUBLE_EQ(c[10], 6000.0);
    // c0 is twice the normal radius of curvature of WGS 84 at the centre.
    const double e2 = 0.00669437999014;
    const double dfSin = std::sin(psSeg->dfCentreLatitude);
    EXPECT_NEAR(c[0], 2 * 6378137.0 / std::sqrt(1 - e2 * dfSin * dfSin), 1e-3);
    EXPECT_DOUBLE_EQ(c[6], std::cos(std::atan(c[13])));
    EXPECT_DOUBLE_EQ(c[15], c[14] / c[6]);
    EXPECT_EQ(c[20], 0.0);
    EXPECT_EQ(c[21], 0.0);
    EXPECT_EQ(c[22], 0.0);
    EXPECT_EQ(c[18], 0.0);  // P12 is not adjusted for 12 unknowns
    // Ground distance per line and per across-track angle: 5 m lines and
    // the satellite height near nadir.
    EXPECT_NEAR(c[11], psSeg->dfLineRes, 0.05);
    EXPECT_NEAR(c[12], psSeg->dfSatHeight, 2000.0);
    // The scene centre is where the centre pixel looks at height 0.
    double dfX = 0, dfY = 0, dfXc = 0, dfYc = 0;
    ASSERT_TRUE(sScene.ImageToGround(6000, 6000, 0.0, &dfX, &dfY));
    toutin_1_imp(psModel.get(), 0.0, 0.0, 0.0, &dfXc, &dfYc);
    EXPECT_EQ(dfXc, c[16]);  // exact at the centre
    EXPECT_EQ(dfYc, c[17]);
    EXPECT_NEAR(dfXc, dfX, 1.0);
    EXPECT_NEAR(dfYc, dfY, 1.0);
    // The control points themselves are reproduced.
    double dfRmsPixel = -1, dfRmsLine = -1;
    SRITRMSError(psModel.get(), g.Count(), g.x.data(), g.y.data(), g.z.data(), g.p.data(),
                 g.l.data(), dfRmsPixel, dfRmsLine);
    EXPECT_LT(dfRmsPixel, 0.1);
    EXPECT_LT(dfRmsLine, 0.1);
    // bImageFirst false swaps the pairs and gives the same model.
    ModelPtr psSwapped(SRITAllocate());
    ASSERT_EQ(
        SRITCalculate(psSwapped.get(), false, sScene.MakeSegment(), g.Count(), &sScene.Projection(),
                      g.x.data(), g.y.data(), g.z.data(), g.p.data(), g.l.data()),
        1);
    for (int i = 0; i < SRIT_NUM_COEFS; ++i) EXPECT_EQ(psSwapped->adfCoef[i], c[i]) << i;
}

TEST(SRITCalculate, SensorRowsDecideTheSetUp) {
    struct Case {
        const char* pszName;
        int nPoints;
        const char* pszShort;
        int nSensor;
    };
    const Case asCases[] = {
        {"SPOT5_PAN_2_5A", 6, "SPOT5_PAN_2_5", 54},
        {"spot5_multi", 4, "SPOT5_MULTI", 57},
        {"QBIRD_PAN_STD", 8, "QBIRD_PAN", 44},
        {"QBIRD_X", 8, "QBIRD_MULTI", 47},
        {"ALOS_PRISM_L1B", 8, "ALOS_PRISM_L1B", 78},
        {"WVIEW1_PAN", 8, "WVIEW_PAN", 93},
        {"NEW", 5, "NEW", 184},
        // 16 unknowns in the catalogue are adjusted as the model's 13.
        {"MEIS", 12, "MEIS", 184},
        {"IRIS", 12, "IRIS", 184},
    };
    for (const Case& c : asCases) {
        ModelPtr psModel = FitNamed(c.pszName, c.nPoints);
        EXPECT_EQ(std::string(psModel->Sensor, strnlen(psModel->Sensor, SRIT_SENSOR_SIZE)),
                  c.pszShort);
        EXPECT_EQ(psModel->nSensor, c.nSensor) << c.pszName;
        for (double dfCoef : psModel->adfCoef) EXPECT_TRUE(std::isfinite(dfCoef)) << c.pszName;
    }
    // 13 unknowns fit P12 as well and still reproduce the scene.
    ModelPtr psIris = FitNamed("IRIS", 15);
    double dfPixel = 0, dfLine = 0;
    const Scene sScene{SceneParams()};
    for (const SimPoint& s : sScene.SamplePoints(20, 77, 0.0, 2000.0)) {
        SRITGeo2Img(psIris.get(), s.dfX, s.dfY, s.dfZ, &dfPixel, &dfLine);
        EXPECT_NEAR(dfPixel, s.dfPixel, 0.5);
        EXPECT_NEAR(dfLine, s.dfLine, 0.5);
    }
}

TEST(SRITCalculate, FailuresLeaveTheRecordAndSegmentToTheCaller) {
    const Scene sScene{SceneParams()};
    Gcps g(sScene.SamplePoints(6, 9, 0.0, 1000.0));
    ModelPtr psModel(SRITAllocate());
    const SRITInfo_t* psBefore = psModel.get();
    EphemerisSeg_t* psEmpty = psModel->psEphemeris;
    SegmentPtr psSeg(sScene.MakeSegment());
    // Too few points: 0, nothing touched.
    EXPECT_EQ(SRITCalculate(psModel.get(), true, psSeg.get(), 2, &sScene.Projection(), g.p.data(),
                            g.l.data(), g.z.data(), g.x.data(), g.y.data()),
              0);
    EXPECT_EQ(psModel->psEphemeris, psEmpty);
    testing::internal::CaptureStdout();
    // A geographic projection is not a conformal ground unit: error 32.
    ProjInfo_t sGeo{};
    ASSERT_EQ(Geosys2ProjInfo(&sGeo, "LONG/LAT D000", 0, 0, 1, 1), 0);
    EXPECT_EQ(NumberedErrorCode([&] { Calculate(psModel.get(), psSeg.get(), sGeo, g); }), 32);
    const std::string osPrinted = testing::internal::GetCapturedStdout();
    EXPECT_NE(osPrinted.find("Invalid GCP unit! Unit must be one of the following :\n"),
              std::string::npos);
    // An unknown sensor, and a group prefix none of whose rows matches: 19.
    for (const char* pszName :
         {"UNKNOWN", "SPOT5", "SPOT5_HRS", "CBERS_X", "FORMOSAT_Q", "ALOS_X", "KOMPSAT3_PAN"}) {
        std::memset(psSeg->szSensorName, 0, sizeof(psSeg->szSensorName));
        std::strncpy(psSeg->szSensorName, pszName, sizeof(psSeg->szSensorName) - 1);
        testing::internal::CaptureStdout();
        EXPECT_EQ(NumberedErrorCode(
                      [&] { Calculate(psModel.get(), psSeg.get(), sScene.Projection(), g); }),
                  19)
            << pszName;
        EXPECT_EQ(testing::internal::GetCapturedStdout(), "Unsupported satellite sensor\n");
    }
    std::strncpy(psSeg->szSensorName, "SPOT5_PAN_5", sizeof(psSeg->szSensorName) - 1);
    // A coordinate that is not a number, or the null value: error 100.
    g.x[3] = std::nan("");
    EXPECT_EQ(
        NumberedErrorCode([&] { Calculate(psModel.get(), psSeg.get(), sScene.Projection(), g); }),
        100);
    g.x[3] = LUMO_NULL_VALUE;
    EXPECT_EQ(
        NumberedErrorCode([&] { Calculate(psModel.get(), psSeg.get(), sScene.Projection(), g); }),
        100);
    // A segment with a nonsensical orbit cannot start the adjustment.
    g = Gcps(sScene.SamplePoints(6, 9, 0.0, 1000.0));
    const double dfRadius = psSeg->dfOrbitRadius;
    psSeg->dfOrbitRadius = std::nan("");
    EXPECT_EQ(
        NumberedErrorCode([&] { Calculate(psModel.get(), psSeg.get(), sScene.Projection(), g); }),
        100);
    psSeg->dfOrbitRadius = dfRadius;
    // A negative second earth parameter: error 32.
    ProjInfo_t sBadEarth = sScene.Projection();
    sBadEarth.nEarthModelKind = 3;
    sBadEarth.adfProjParms[0] = 6378137.0;
    sBadEarth.adfProjParms[1] = -1.0;
    EXPECT_EQ(NumberedErrorCode([&] { Calculate(psModel.get(), psSeg.get(), sBadEarth, g); }), 32);
    // Null arrays: error 100.
    EXPECT_EQ(NumberedErrorCode([&] {
                  SRITCalculate(psModel.get(), true, psSeg.get(), 6, &sScene.Projection(), nullptr,
                                g.l.data(), g.z.data(), g.x.data(), g.y.data());
              }),
              100);
    // None of the failures touched the record; the segment is still ours.
    EXPECT_EQ(psModel.get(), psBefore);
    EXPECT_EQ(psModel->psEphemeris, psEmpty);
    EXPECT_EQ(psModel->adfCoef[0], 0.0);
    EXPECT_EQ(psModel->nSensor, 0);
}

TEST(SRITCalculate, EdgeCasesOfTheInput) {
    const Scene sScene{SceneParams()};
    // Exactly three points are accepted.
    Gcps g(sScene.SamplePoints(3, 13, 0.0, 1000.0));
    ModelPtr psModel(SRITAllocate());
    EXPECT_EQ(Calculate(psModel.get(), sScene.MakeSegment(), sScene.Projection(), g), 1);
    // All points at one elevation: the first is raised by 1 m, which is the
    // same as giving it 1 m higher.
    Gcps gFlat(sScene.SamplePoints(8, 14, 500.0, 500.0));
    for (double& z : gFlat.z) z = 500.0;
    ModelPtr psFlat(SRITAllocate());
    ASSERT_EQ(Calculate(psFlat.get(), sScene.MakeSegment(), sScene.Projection(), gFlat), 1);
    gFlat.z[0] = 501.0;
    ModelPtr psRaised(SRITAllocate());
    ASSERT_EQ(Calculate(psRaised.get(), sScene.MakeSegment(), sScene.Projection(), gFlat), 1);
    for (int i = 0; i < SRIT_NUM_COEFS; ++i) {
        EXPECT_EQ(psFlat->adfCoef[i], psRaised->adfCoef[i]) << i;
    }
    // A second computation into the same record releases its old segment
    // (checked by the sanitizer build) and adopts the new one.
    EphemerisSeg_t* psSecond = sScene.MakeSegment();
    ASSERT_EQ(Calculate(psFlat.get(), psSecond, sScene.Projection(), g), 1);
    EXPECT_EQ(psFlat->psEphemeris, psSecond);
    // The same segment twice is kept, not released.
    ASSERT_EQ(Calculate(psFlat.get(), psSecond, sScene.Projection(), g), 1);
    EXPECT_EQ(psFlat->psEphemeris, psSecond);
}

TEST(SRITCalculate, ComputationsRunSideBySide) {
    // The working state belongs to each call: parallel fits equal serial ones.
    SceneParams s;
    s.dfRollDeg = 10.0;
    const Scene sScene(s);
    const Gcps g(sScene.SamplePoints(10, 21, 0.0, 2000.0));
    ModelPtr psSerial(SRITAllocate());
    ASSERT_EQ(Calculate(psSerial.get(), sScene.MakeSegment(), sScene.Projection(), g), 1);
    std::vector<ModelPtr> apsModels;
    apsModels.reserve(4);
    for (int i = 0; i < 4; ++i) apsModels.emplace_back(SRITAllocate());
    std::vector<EphemerisSeg_t*> apsSegs;
    apsSegs.reserve(4);
    for (int i = 0; i < 4; ++i) apsSegs.push_back(sScene.MakeSegment());
    std::vector<std::thread> aoThreads;
    aoThreads.reserve(4);
    for (int i = 0; i < 4; ++i) {
        aoThreads.emplace_back([&, i] {
            for (int n = 0; n < 20; ++n) {
                EphemerisSeg_t* psSeg = n == 0 ? apsSegs[i] : apsModels[i]->psEphemeris;
                Calculate(apsModels[i].get(), psSeg, sScene.Projection(), g);
            }
        });
    }
    for (std::thread& t : aoThreads) t.join();
    for (const ModelPtr& psModel : apsModels) {
        for (int i = 0; i < SRIT_NUM_COEFS; ++i) {
            EXPECT_EQ(psModel->adfCoef[i], psSerial->adfCoef[i]) << i;
        }
    }
}

TEST(SRITTransforms, NullValuesAndExactProperties) {
    ModelPtr psModel = FitNamed("SPOT5_PAN_5", 10, 20.0);
    double dfX = 1, dfY = 2;
    // No elevation: 0 and null outputs.
    EXPECT_EQ(SRITImg2Geo_imp(psModel.get(), 100, 200, LUMO_NULL_VALUE, &dfX, &dfY), 0);
    EXPECT_EQ(dfX, LUMO_NULL_VALUE);
    EXPECT_EQ(dfY, LUMO_NULL_VALUE);
    // Img2GeoDem takes 0 for a missing elevation and writes it back.
    double dfZ = LUMO_NULL_VALUE, dfX0 = 0, dfY0 = 0;
    EXPECT_EQ(SRITImg2GeoDem(psModel.get(), 100, 200, &dfZ, &dfX, &dfY), 1);
    EXPECT_EQ(dfZ, 0.0);
    EXPECT_EQ(SRITImg2Geo_imp(psModel.get(), 100, 200, 0.0, &dfX0, &dfY0), 1);
    EXPECT_EQ(dfX, dfX0);
    EXPECT_EQ(dfY, dfY0);
    // The generic dispatch reaches the family with code 2.
    double dfPixel = 0, dfLine = 0, dfPixel2 = 0, dfLine2 = 0;
    EXPECT_EQ(GenGeo2Img(2, psModel.get(), dfX, dfY, 0.0, &dfPixel, &dfLine), 1);
    SRITGeo2Img(psModel.get(), dfX, dfY, 0.0, &dfPixel2, &dfLine2);
    EXPECT_EQ(dfPixel, dfPixel2);
    EXPECT_EQ(dfLine, dfLine2);
    EXPECT_NEAR(dfPixel, 100, 1.0);
    EXPECT_NEAR(dfLine, 200, 1.0);
    double dfX2 = 0, dfY2 = 0;
    EXPECT_EQ(GenImg2Geo(2, psModel.get(), 100, 200, 0.0, &dfX2, &dfY2), 1);
    EXPECT_EQ(dfX2, dfX0);
    // Null model: null outputs instead of a crash.
    SRITGeo2Img(nullptr, 1, 2, 3, &dfPixel, &dfLine);
    EXPECT_EQ(dfPixel, LUMO_NULL_VALUE);
    EXPECT_EQ(SRITGeo2ImgExact(nullptr, 1, 2, 3, &dfPixel, &dfLine), 0);
    EXPECT_EQ(SRITGeo2ImgExact(psModel.get(), std::nan(""), 2, 3, &dfPixel, &dfLine), 0);
    EXPECT_EQ(dfLine, LUMO_NULL_VALUE);

    // Model class 2 has no Earth-curvature term: the elevation acts through
    // H = h alone, so two classes differ only off the centre.
    SRITInfo_t* psFlat = SRITAllocate();
    SRITCopy(psFlat, psModel.get());
    psFlat->nModelClass = 2;
    double dfXa = 0, dfYa = 0, dfXb = 0, dfYb = 0;
    toutin_1_imp(psFlat, 0.0, 0.0, 500.0, &dfXa, &dfYa);
    toutin_1_imp(psModel.get(), 0.0, 0.0, 500.0, &dfXb, &dfYb);
    EXPECT_EQ(dfXa, dfXb);  // u = 0 at the centre column
    toutin_1_imp(psFlat, -5000.0, 0.0, 500.0, &dfXa, &dfYa);
    toutin_1_imp(psModel.get(), -5000.0, 0.0, 500.0, &dfXb, &dfYb);
    const double* c = psModel->adfCoef;
    const double u = -c[12] * c[2] * -5000.0 / (c[14] * c[2] * -5000.0 + 1.0);
    // Without the curvature term H is larger by u^2/c0; A and B change by
    // that times their factors of H.
    const double dfFactor = (c[14] * c[14] + 1.0) / c[12] * u + c[15];
    const double dA = -dfFactor * (u * u / c[0]);
    const double dB = c[13] * (u * u / c[0]);
    EXPECT_NEAR(dfXa - dfXb, dA * std::cos(c[8]) + dB * std::sin(c[8]), 1e-6);
    EXPECT_NEAR(dfYa - dfYb, -dA * std::sin(c[8]) + dB * std::cos(c[8]), 1e-6);
    // Sensor 50 (lens distortion): at pixel 6000 the pixel shift is 0 and the
    // line shift 0.0014496*865 - 6.9536888e-11*865^3.
    SRITInfo_t* psLens = SRITAllocate();
    SRITCopy(psLens, psModel.get());
    psLens->nSensor = 50;
    psLens->nModelClass = 5;
    SRITInfo_t* psPlain = SRITAllocate();
    SRITCopy(psPlain, psLens);
    psPlain->nSensor = 51;
    const double dfShift = 0.0014496 * 865.0 - 6.9536888e-11 * 865.0 * 865.0 * 865.0;
    toutin_1_imp(psLens, c[4] - 6000.0, 10.0, 300.0, &dfXa, &dfYa);
    toutin_1_imp(psPlain, c[4] - 6000.0, 10.0 + dfShift, 300.0, &dfXb, &dfYb);
    EXPECT_NEAR(dfXa, dfXb, 1e-9);
    EXPECT_NEAR(dfYa, dfYb, 1e-9);
    LumoFreeSRITInfo(psLens);
    LumoFreeSRITInfo(psPlain);
    LumoFreeSRITInfo(psFlat);
}

TEST(SRITResiduals, RootMeanSquareOverThePoints) {
    ModelPtr psModel = FitNamed("SPOT5_PAN_5", 8);
    double adfX[2], adfY[2], adfZ[2] = {100.0, 900.0}, adfP[2], adfL[2];
    for (int i = 0; i < 2; ++i) {
        SRITImg2Geo_imp(psModel.get(), 3000.0 + 4000 * i, 5000.0, adfZ[i], &adfX[i], &adfY[i]);
        SRITGeo2Img(psModel.get(), adfX[i], adfY[i], adfZ[i], &adfP[i], &adfL[i]);
    }
    double dfRmsPixel = -1, dfRmsLine = -1;
    // One point: both 0 whatever it is.
    SRITRMSError(psModel.get(), 1, adfX, adfY, adfZ, adfP, adfL, dfRmsPixel, dfRmsLine);
    EXPECT_EQ(dfRmsPixel, 0.0);
    EXPECT_EQ(dfRmsLine, 0.0);
    // Points the model reproduces: 0 and 0.
    SRITRMSError(psModel.get(), 2, adfX, adfY, adfZ, adfP, adfL, dfRmsPixel, dfRmsLine);
    EXPECT_EQ(dfRmsPixel, 0.0);
    EXPECT_EQ(dfRmsLine, 0.0);
    // Pixel residuals +3 and -3, none in line: 3 and 0.
    adfP[0] += 3.0;
    adfP[1] -= 3.0;
    SRITRMSError(psModel.get(), 2, adfX, adfY, adfZ, adfP, adfL, dfRmsPixel, dfRmsLine);
    EXPECT_NEAR(dfRmsPixel, 3.0, 1e-12);
    EXPECT_EQ(dfRmsLine, 0.0);
    EXPECT_EQ(NumberedErrorCode([&] {
                  SRITRMSError(psModel.get(), 2, nullptr, adfY, adfZ, adfP, adfL, dfRmsPixel,
                               dfRmsLine);
              }),
              100);
}

TEST(SRITMathModel, ObjectWrapsARigorousRecord) {
    SceneParams s;
    const Scene sScene(s);
    ModelPtr psModel = FitNamed("SPOT5_PAN_5", 10);
    psModel->anAux[0] = 3;
    nova::mathmodel::LumoMathModel oModel(nova::mathmodel::LUMO_MODEL_SRIT, psModel.get());
    EXPECT_EQ(oModel.GetLumoModelType(), nova::mathmodel::LUMO_MODEL_SRIT);
    EXPECT_EQ(oModel.GetNumColumns(), 12000);
    EXPECT_EQ(oModel.GetNumRows(), 12000);
    EXPECT_EQ(oModel.GetDownsampleFactor(), 3);
    EXPECT_NE(oModel.GetModel(), psModel.get());  // its own copy
    ASSERT_NE(oModel.GetCRS(), nullptr);
    const SimPoint p = sScene.SamplePoints(1, 99, 0.0, 1000.0)[0];
    double dfPixel = 0, dfLine = 0, dfPixel2 = 0, dfLine2 = 0;
    EXPECT_EQ(oModel.GroundToImage(p.dfX, p.dfY, p.dfZ, dfPixel, dfLine, false), 0);
    SRITGeo2Img(psModel.get(), p.dfX, p.dfY, p.dfZ, &dfPixel2, &dfLine2);
    EXPECT_EQ(dfPixel, dfPixel2);
    EXPECT_EQ(dfLine, dfLine2);
    std::unique_ptr<nova::mathmodel::IMathModel> poClone(oModel.Clone());
    double dfX = 0, dfY = 0;
    EXPECT_EQ(poClone->ImageToGround(dfPixel, dfLine, p.dfZ, dfX, dfY, false), 0);
    EXPECT_NEAR(dfX, p.dfX, 10.0);
    EXPECT_NEAR(dfY, p.dfY, 10.0);
    oModel.SetDownsampleFactor(2);
    EXPECT_EQ(static_cast<const SRITInfo_t*>(oModel.GetModel())->anAux[0], 2);
}

}  // namespace

namespace {

TEST(SRITContainer, FitsEvaluatesAndMeasuresThroughTheContainer) {
    SceneParams s;
    s.dfRollDeg = 20.0;
    const Scene sScene(s);
    Gcps g(sScene.SamplePoints(10, 5, 0.0, 2000.0));
    SegmentPtr psSeg(sScene.MakeSegment());
    TRNSritExtra_t sExtra{sScene.Projection(), psSeg.get(), 0};
    std::unique_ptr<TRNInfo_t, void (*)(TRNInfo_t*)> psTrn(TRNAllocate(TRN_SRIT), &TRNDeallocate);
    ASSERT_NE(psTrn->pModel, nullptr);
    // Two points: not calculated, transforms give zeros.
    TRNCalculate3D(psTrn.get(), 2, g.x.data(), g.y.data(), g.z.data(), g.p.data(), g.l.data(),
                   nullptr, &sExtra);
    EXPECT_EQ(psTrn->bCalculated, 0);
    double dfPixel = 7, dfLine = 7, dfOutZ = 7;
    EXPECT_EQ(TRNTransform3D(psTrn.get(), g.x[0], g.y[0], g.z[0], &dfPixel, &dfLine, &dfOutZ), 0);
    EXPECT_EQ(dfPixel, 0.0);
    // Ground first, image second (flag 0): the same model as a direct fit.
    TRNCalculate3D(psTrn.get(), g.Count(), g.x.data(), g.y.data(), g.z.data(), g.p.data(),
                   g.l.data(), nullptr, &sExtra);
    ASSERT_EQ(psTrn->bCalculated, 1);
    ModelPtr psDirect(SRITAllocate());
    ASSERT_EQ(Calculate(psDirect.get(), sScene.MakeSegment(), sScene.Projection(), g), 1);
    const auto* psFitted = static_cast<const SRITInfo_t*>(psTrn->pModel);
    for (int i = 0; i < SRIT_NUM_COEFS; ++i) EXPECT_EQ(psFitted->adfCoef[i], psDirect->adfCoef[i]);
    EXPECT_NE(psFitted->psEphemeris, psSeg.get());  // the container's own copy
    EXPECT_EQ(TRNTransform3D(psTrn.get(), g.x[1], g.y[1], g.z[1], &dfPixel, &dfLine, &dfOutZ), 1);
    EXPECT_EQ(dfOutZ, 0.0);
    EXPECT_NEAR(dfPixel, g.p[1], 0.5);
    EXPECT_NEAR(dfLine, g.l[1], 0.5);
    // 2-D residuals are not provided for the rigorous kind; 3-D ones are.
    double dfRmsX = 9, dfRmsY = 9;
    TRNRMSError(psTrn.get(), g.Count(), g.x.data(), g.y.data(), g.p.data(), g.l.data(), &dfRmsX,
                &dfRmsY);
    EXPECT_EQ(dfRmsX, 0.0);
    EXPECT_EQ(dfRmsY, 0.0);
    TRNRMSError3D(psTrn.get(), g.Count(), g.x.data(), g.y.data(), g.z.data(), g.p.data(),
                  g.l.data(), &dfRmsX, &dfRmsY);
    double dfRmsPixel = 0, dfRmsLine = 0;
    SRITRMSError(psDirect.get(), g.Count(), g.x.data(), g.y.data(), g.z.data(), g.p.data(),
                 g.l.data(), dfRmsPixel, dfRmsLine);
    EXPECT_EQ(dfRmsX, dfRmsPixel);
    EXPECT_EQ(dfRmsY, dfRmsLine);
    EXPECT_GT(dfRmsX, 0.0);
    // A scene longer than 30 000 lines with a per-line table fits: the
    // arrays follow the segment's table.
    SceneParams sLong;
    sLong.osSensorName = "PLA";
    sLong.nLines = 40000;
    const Scene sLongScene(sLong);
    SegmentPtr psLongSeg(sLongScene.MakeSegment());
    auto* psTable = static_cast<AttitudeData_t*>(HCalloc(1, sizeof(AttitudeData_t)));
    psTable->nNumAttitudeLines = 40000;
    psTable->pAttitudeLines = static_cast<AttitudeLine_t*>(HCalloc(40000, sizeof(AttitudeLine_t)));
    psTable->pAttitudeLines[39999].dfValue1 = 4.5;
    psLongSeg->ppOrbitData = static_cast<void**>(HMalloc(sizeof(void*)));
    *psLongSeg->ppOrbitData = psTable;
    psLongSeg->nOrbitType = EPH_ORBIT_ATTITUDE;
    Gcps gLong(sLongScene.SamplePoints(8, 6, 0.0, 1000.0));
    TRNSritExtra_t sLongExtra{sLongScene.Projection(), psLongSeg.get(), 0};
    std::unique_ptr<TRNInfo_t, void (*)(TRNInfo_t*)> psLongTrn(TRNAllocate(TRN_SRIT),
                                                               &TRNDeallocate);
    TRNCalculate3D(psLongTrn.get(), gLong.Count(), gLong.x.data(), gLong.y.data(), gLong.z.data(),
                   gLong.p.data(), gLong.l.data(), nullptr, &sLongExtra);
    ASSERT_EQ(psLongTrn->bCalculated, 1);
    const auto* psLongModel = static_cast<const SRITInfo_t*>(psLongTrn->pModel);
    ASSERT_NE(psLongModel->padfLineShiftA, nullptr);
    EXPECT_EQ(psLongModel->padfLineShiftA[39999], 4.5);
    EXPECT_EQ(psLongModel->nSensor, 0);
}

}  // namespace
