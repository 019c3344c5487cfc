// Rigorous model computation, transforms and residuals: the record against
// the simulator's geometry, sensor rows, failure paths, exact properties of
// the transforms, the model object and the container.
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
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
#include "support/numbered_error.h"
#include "support/segments.h"
#include "support/sim_gcps.h"
#include "support/srit_block.h"

namespace {

using lumo::sim::Scene;
using lumo::sim::SceneParams;
using lumo::sim::SimPoint;
using lumo::support::FatalOf;
using lumo::support::SegmentPtr;
using ModelPtr = lumo::support::SritPtr;
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

TEST(SRITCalculate, FillsTheRecordFromTheSegmentAndAdoptsIt) {
    const Scene sScene{SceneParams()};
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
    EXPECT_EQ(c[2], psSeg->dfIFOV);
    EXPECT_EQ(c[4], 6000.0);
    EXPECT_EQ(c[10], 6000.0);
    // c0 is twice the normal radius of curvature of WGS 84 at the centre.
    const double e2 = 0.00669437999014, dfSin = std::sin(psSeg->dfCentreLatitude);
    EXPECT_NEAR(c[0], 2 * 6378137.0 / std::sqrt(1 - e2 * dfSin * dfSin), 1e-3);
    EXPECT_EQ(c[6], std::cos(std::atan(c[13])));
    EXPECT_EQ(c[15], c[14] / c[6]);
    EXPECT_EQ(c[18], 0.0);  // P12 is not adjusted for 12 unknowns
    EXPECT_EQ(c[20] + c[21] + c[22], 0.0);
    // Ground per line and per across-track angle: 5 m lines, the satellite height.
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
    // bImageFirst false swaps the pairs and gives the same model.
    ModelPtr psSwapped(SRITAllocate());
    ASSERT_EQ(
        SRITCalculate(psSwapped.get(), false, sScene.MakeSegment(), g.Count(), &sScene.Projection(),
                      g.x.data(), g.y.data(), g.z.data(), g.p.data(), g.l.data()),
        1);
    EXPECT_EQ(std::memcmp(psSwapped->adfCoef, c, sizeof psSwapped->adfCoef), 0);
}

// The sensor row decides the short name, the code and the unknowns; every
// set-up reproduces the simulated scene at check points.
TEST(SRITCalculate, SensorRowsDecideTheSetUp) {
    const struct {
        const char* pszName;
        int nPoints;
        const char* pszShort;
        int nSensor;
    } asCases[] = {
        {"SPOT5_PAN_2_5A", 6, "SPOT5_PAN_2_5", 54},   // sub-row of a group
        {"QBIRD_X", 8, "QBIRD_MULTI", 47},            // the group's catch-all row
        {"ALOS_PRISM_L1B", 8, "ALOS_PRISM_L1B", 78},  // the whole name as short name
        {"WVIEW1_PAN", 8, "WVIEW_PAN", 93},           // the alternative prefix
        {"MEIS", 12, "MEIS", 184},                    // 16 unknowns adjusted as 13
        {"IRIS", 15, "IRIS", 184},                    // 13 unknowns: P12 as well
    };
    const std::vector<SimPoint> asCheck = Scene(SceneParams()).SamplePoints(20, 77, 0.0, 2000.0);
    for (const auto& c : asCases) {
        SCOPED_TRACE(c.pszName);
        ModelPtr psModel = FitNamed(c.pszName, c.nPoints);
        EXPECT_EQ(std::string(psModel->Sensor, strnlen(psModel->Sensor, SRIT_SENSOR_SIZE)),
                  c.pszShort);
        EXPECT_EQ(psModel->nSensor, c.nSensor);
        EXPECT_LT(lumo::support::CheckRms(psModel.get(), asCheck), 0.5);
    }
}

TEST(SRITCalculate, FailuresLeaveTheRecordAndSegmentToTheCaller) {
    const Scene sScene{SceneParams()};
    Gcps g(sScene.SamplePoints(6, 9, 0.0, 1000.0));
    ModelPtr psModel(SRITAllocate());
    EphemerisSeg_t* psEmpty = psModel->psEphemeris;
    SegmentPtr psSeg(sScene.MakeSegment());
    const auto fnFit = [&](const ProjInfo_t& sProj) {
        Calculate(psModel.get(), psSeg.get(), sProj, g);
    };
    // A geographic projection is not a conformal ground unit: error 32.
    ProjInfo_t sGeo{};
    ASSERT_EQ(Geosys2ProjInfo(&sGeo, "LONG/LAT D000", 0, 0, 1, 1), 0);
    testing::internal::CaptureStdout();
    EXPECT_EQ(FatalOf([&] { fnFit(sGeo); }).first, 32);
    const std::string osPrinted = testing::internal::GetCapturedStdout();
    EXPECT_NE(osPrinted.find("Invalid GCP unit!"), std::string::npos);
    EXPECT_EQ(osPrinted.find("KROV"), std::string::npos) << "lists a unit nothing accepts";
    // An unknown sensor, and a group prefix none of whose rows matches: 19.
    for (const char* pszName : {"UNKNOWN", "CBERS_X"}) {
        std::memset(psSeg->szSensorName, 0, sizeof(psSeg->szSensorName));
        std::strncpy(psSeg->szSensorName, pszName, sizeof(psSeg->szSensorName) - 1);
        testing::internal::CaptureStdout();
        EXPECT_EQ(FatalOf([&] { fnFit(sScene.Projection()); }).first, 19) << pszName;
        EXPECT_EQ(testing::internal::GetCapturedStdout(), "Unsupported satellite sensor\n");
    }
    std::strncpy(psSeg->szSensorName, "SPOT5_PAN_5", sizeof(psSeg->szSensorName) - 1);
    // A coordinate that is not a number, or the null value, and a segment
    // with a nonsensical orbit: error 100.
    for (double dfBad : {std::nan(""), LUMO_NULL_VALUE}) {
        g.x[3] = dfBad;
        EXPECT_EQ(FatalOf([&] { fnFit(sScene.Projection()); }).first, 100);
    }
    g = Gcps(sScene.SamplePoints(6, 9, 0.0, 1000.0));
    const double dfRadius = psSeg->dfOrbitRadius;
    psSeg->dfOrbitRadius = std::nan("");
    EXPECT_EQ(FatalOf([&] { fnFit(sScene.Projection()); }).first, 100);
    psSeg->dfOrbitRadius = dfRadius;
    // A negative second earth parameter: error 32 naming the value.
    ProjInfo_t sBadEarth = sScene.Projection();
    sBadEarth.nEarthModelKind = 3;
    sBadEarth.adfProjParms[0] = 6378137.0;
    sBadEarth.adfProjParms[1] = -1.0;
    const auto sEarth = FatalOf([&] { fnFit(sBadEarth); });
    EXPECT_EQ(sEarth.first, 32);
    EXPECT_NE(sEarth.second.find("Earth model"), std::string::npos);
    // A record asking for an unknown form of the equations: error 11 naming it.
    psModel->anAux[SRIT_AUX_FORM] = 7;
    const auto sForm = FatalOf([&] { fnFit(sScene.Projection()); });
    EXPECT_EQ(sForm.first, 11);
    EXPECT_NE(sForm.second.find("anAux[1] (the model form) is 7"), std::string::npos);
    psModel->anAux[SRIT_AUX_FORM] = SRIT_FORM_CLASSIC;
    EXPECT_EQ(FatalOf([&] {
                  SRITCalculate(psModel.get(), true, psSeg.get(), 6, &sScene.Projection(), nullptr,
                                g.l.data(), g.z.data(), g.x.data(), g.y.data());
              }).first,
              100);
    // None of the failures touched the record; the segment is still ours.
    EXPECT_EQ(psModel->psEphemeris, psEmpty);
    EXPECT_EQ(psModel->adfCoef[0], 0.0);
}

TEST(SRITCalculate, EdgeCasesAndSideBySideComputations) {
    SceneParams s;
    s.dfRollDeg = 10.0;
    const Scene sScene(s);
    // All points at one elevation: the first is raised by 1 m, which is the
    // same as giving it 1 m higher.
    Gcps gFlat(sScene.SamplePoints(8, 14, 500.0, 500.0));
    ModelPtr psFlat(SRITAllocate());
    ASSERT_EQ(Calculate(psFlat.get(), sScene.MakeSegment(), sScene.Projection(), gFlat), 1);
    gFlat.z[0] = 501.0;
    ModelPtr psRaised(SRITAllocate());
    ASSERT_EQ(Calculate(psRaised.get(), sScene.MakeSegment(), sScene.Projection(), gFlat), 1);
    EXPECT_EQ(std::memcmp(psFlat->adfCoef, psRaised->adfCoef, sizeof psFlat->adfCoef), 0);
    // Exactly three points are accepted; a second computation into the same
    // record releases its old segment (sanitizer build) and adopts the new
    // one, and the same segment twice is kept.
    const Gcps g3(sScene.SamplePoints(3, 13, 0.0, 1000.0));
    EphemerisSeg_t* psSecond = sScene.MakeSegment();
    ASSERT_EQ(Calculate(psFlat.get(), psSecond, sScene.Projection(), g3), 1);
    ASSERT_EQ(Calculate(psFlat.get(), psSecond, sScene.Projection(), g3), 1);
    EXPECT_EQ(psFlat->psEphemeris, psSecond);

    // The working state belongs to each call: parallel fits equal serial ones.
    const Gcps g(sScene.SamplePoints(10, 21, 0.0, 2000.0));
    ModelPtr psSerial(SRITAllocate());
    ASSERT_EQ(Calculate(psSerial.get(), sScene.MakeSegment(), sScene.Projection(), g), 1);
    std::vector<ModelPtr> apsModels;
    std::vector<EphemerisSeg_t*> apsSegs;
    std::vector<std::thread> aoThreads;
    for (int i = 0; i < 4; ++i) {
        apsModels.emplace_back(SRITAllocate());
        apsSegs.push_back(sScene.MakeSegment());
    }
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
        EXPECT_EQ(std::memcmp(psModel->adfCoef, psSerial->adfCoef, sizeof psModel->adfCoef), 0);
    }
}

TEST(SRITTransforms, NullValuesAndExactProperties) {
    ModelPtr psModel = FitNamed("SPOT5_PAN_5", 10, 20.0);
    double dfX = 1, dfY = 2, dfX0 = 0, dfY0 = 0;
    // No elevation: 0 and null outputs; Img2GeoDem takes 0 and writes it back.
    EXPECT_EQ(SRITImg2Geo_imp(psModel.get(), 100, 200, LUMO_NULL_VALUE, &dfX, &dfY), 0);
    EXPECT_EQ(dfX, LUMO_NULL_VALUE);
    EXPECT_EQ(dfY, LUMO_NULL_VALUE);
    double dfZ = LUMO_NULL_VALUE;
    EXPECT_EQ(SRITImg2GeoDem(psModel.get(), 100, 200, &dfZ, &dfX, &dfY), 1);
    EXPECT_EQ(dfZ, 0.0);
    EXPECT_EQ(SRITImg2Geo_imp(psModel.get(), 100, 200, 0.0, &dfX0, &dfY0), 1);
    EXPECT_EQ(dfX, dfX0);
    EXPECT_EQ(dfY, dfY0);
    // Null model and input that is not a number: null outputs, no crash.
    double dfPixel = 0, dfLine = 0;
    SRITGeo2Img(nullptr, 1, 2, 3, &dfPixel, &dfLine);
    EXPECT_EQ(dfPixel, LUMO_NULL_VALUE);
    EXPECT_EQ(SRITGeo2ImgExact(nullptr, 1, 2, 3, &dfPixel, &dfLine), 0);
    EXPECT_EQ(SRITGeo2ImgExact(psModel.get(), std::nan(""), 2, 3, &dfPixel, &dfLine), 0);
    EXPECT_EQ(dfLine, LUMO_NULL_VALUE);

    // Model class 2 has no Earth-curvature term: off the centre the
    // elevation is larger by u^2/c0, and A and B change by that times their
    // factors of H (at the centre column u = 0 and nothing changes).
    ModelPtr psFlat(SRITAllocate());
    SRITCopy(psFlat.get(), psModel.get());
    psFlat->nModelClass = 2;
    double dfXa = 0, dfYa = 0, dfXb = 0, dfYb = 0;
    toutin_1_imp(psFlat.get(), -5000.0, 0.0, 500.0, &dfXa, &dfYa);
    toutin_1_imp(psModel.get(), -5000.0, 0.0, 500.0, &dfXb, &dfYb);
    const double* c = psModel->adfCoef;
    const double u = -c[12] * c[2] * -5000.0 / (c[14] * c[2] * -5000.0 + 1.0);
    const double dA = -((c[14] * c[14] + 1.0) / c[12] * u + c[15]) * (u * u / c[0]);
    const double dB = c[13] * (u * u / c[0]);
    EXPECT_NEAR(dfXa - dfXb, dA * std::cos(c[8]) + dB * std::sin(c[8]), 1e-6);
    EXPECT_NEAR(dfYa - dfYb, -dA * std::sin(c[8]) + dB * std::cos(c[8]), 1e-6);
    // Sensor 50 (lens distortion): at pixel 6000 the pixel shift is 0 and the
    // line shift 0.0014496*865 - 6.9536888e-11*865^3.
    ModelPtr psLens(SRITAllocate()), psPlain(SRITAllocate());
    SRITCopy(psLens.get(), psModel.get());
    psLens->nSensor = 50;
    psLens->nModelClass = 5;
    SRITCopy(psPlain.get(), psLens.get());
    psPlain->nSensor = 51;
    const double dfShift = 0.0014496 * 865.0 - 6.9536888e-11 * 865.0 * 865.0 * 865.0;
    toutin_1_imp(psLens.get(), c[4] - 6000.0, 10.0, 300.0, &dfXa, &dfYa);
    toutin_1_imp(psPlain.get(), c[4] - 6000.0, 10.0 + dfShift, 300.0, &dfXb, &dfYb);
    EXPECT_NEAR(dfXa, dfXb, 1e-9);
    EXPECT_NEAR(dfYa, dfYb, 1e-9);
}

TEST(SRITResiduals, RootMeanSquareOverThePoints) {
    ModelPtr psModel = FitNamed("SPOT5_PAN_5", 8);
    double adfX[2], adfY[2], adfZ[2] = {100.0, 900.0}, adfP[2], adfL[2];
    for (int i = 0; i < 2; ++i) {
        SRITImg2Geo_imp(psModel.get(), 3000.0 + 4000 * i, 5000.0, adfZ[i], &adfX[i], &adfY[i]);
        SRITGeo2Img(psModel.get(), adfX[i], adfY[i], adfZ[i], &adfP[i], &adfL[i]);
    }
    // Pixel residuals +3 and -3, none in line: 3 and 0; one point: 0 and 0.
    adfP[0] += 3.0;
    adfP[1] -= 3.0;
    double dfRmsPixel = -1, dfRmsLine = -1;
    SRITRMSError(psModel.get(), 2, adfX, adfY, adfZ, adfP, adfL, dfRmsPixel, dfRmsLine);
    EXPECT_NEAR(dfRmsPixel, 3.0, 1e-12);
    EXPECT_EQ(dfRmsLine, 0.0);
    SRITRMSError(psModel.get(), 1, adfX, adfY, adfZ, adfP, adfL, dfRmsPixel, dfRmsLine);
    EXPECT_EQ(dfRmsPixel, 0.0);
    EXPECT_EQ(FatalOf([&] {
                  SRITRMSError(psModel.get(), 2, nullptr, adfY, adfZ, adfP, adfL, dfRmsPixel,
                               dfRmsLine);
              }).first,
              100);
}

TEST(SRITMathModel, ObjectWrapsItsOwnCopyWithTheDownsampleFactor) {
    ModelPtr psModel = FitNamed("SPOT5_PAN_5", 10);
    psModel->anAux[0] = 3;
    nova::mathmodel::LumoMathModel oModel(nova::mathmodel::LUMO_MODEL_SRIT, psModel.get());
    EXPECT_EQ(oModel.GetNumColumns(), 12000);
    EXPECT_EQ(oModel.GetDownsampleFactor(), 3);
    EXPECT_NE(oModel.GetModel(), psModel.get());
    ASSERT_NE(oModel.GetCRS(), nullptr);
    // Ground to image is the exact inverse of image to ground.
    double dfX = 0, dfY = 0, dfPixel = 0, dfLine = 0;
    ASSERT_EQ(oModel.ImageToGround(3000.5, 7000.25, 800.0, dfX, dfY, false), 0);
    ASSERT_EQ(oModel.GroundToImage(dfX, dfY, 800.0, dfPixel, dfLine, false), 0);
    EXPECT_NEAR(dfPixel, 3000.5, 1e-6);
    EXPECT_NEAR(dfLine, 7000.25, 1e-6);
    oModel.SetDownsampleFactor(2);
    EXPECT_EQ(static_cast<const SRITInfo_t*>(oModel.GetModel())->anAux[0], 2);
}

// The container fits like the direct computation, with the same residuals,
// on its own copy of the segment. A scene longer than 30 000 lines with a
// per-line table fits: the arrays follow the segment's table.
TEST(SRITContainer, FitsLikeTheDirectComputationAndKeepsLongLineTables) {
    const auto fnFit = [](const Scene& sScene, EphemerisSeg_t* psSeg, Gcps g) {
        TRNSritExtra_t sExtra{sScene.Projection(), psSeg, 0};
        lumo::support::TrnPtr psTrn(TRNAllocate(TRN_SRIT));
        TRNCalculate3D(psTrn.get(), g.Count(), g.x.data(), g.y.data(), g.z.data(), g.p.data(),
                       g.l.data(), nullptr, &sExtra);
        EXPECT_EQ(psTrn->bCalculated, 1);
        return psTrn;
    };
    SceneParams s;
    s.dfRollDeg = 20.0;
    const Scene sScene(s);
    Gcps g(sScene.SamplePoints(10, 5, 0.0, 2000.0));
    SegmentPtr psSeg(sScene.MakeSegment());
    const lumo::support::TrnPtr psTrn = fnFit(sScene, psSeg.get(), g);
    ModelPtr psDirect(SRITAllocate());
    ASSERT_EQ(Calculate(psDirect.get(), sScene.MakeSegment(), sScene.Projection(), g), 1);
    const auto* psFitted = static_cast<const SRITInfo_t*>(psTrn->pModel);
    ASSERT_NE(psFitted, nullptr);
    EXPECT_EQ(std::memcmp(psFitted->adfCoef, psDirect->adfCoef, sizeof psDirect->adfCoef), 0);
    EXPECT_NE(psFitted->psEphemeris, psSeg.get());  // the container's own copy
    double dfRmsX = 9, dfRmsY = 9, dfRmsPixel = 0, dfRmsLine = 0;
    TRNRMSError3D(psTrn.get(), g.Count(), g.x.data(), g.y.data(), g.z.data(), g.p.data(),
                  g.l.data(), &dfRmsX, &dfRmsY);
    SRITRMSError(psDirect.get(), g.Count(), g.x.data(), g.y.data(), g.z.data(), g.p.data(),
                 g.l.data(), dfRmsPixel, dfRmsLine);
    EXPECT_EQ(dfRmsX, dfRmsPixel);
    EXPECT_EQ(dfRmsY, dfRmsLine);

    SceneParams sLong;
    sLong.osSensorName = "PLA";
    sLong.nLines = 40000;
    const Scene sLongScene(sLong);
    SegmentPtr psLongSeg(sLongScene.MakeSegment());
    lumo::support::AttachLineTable(psLongSeg.get(), 40000)->pAttitudeLines[39999].dfValue1 = 4.5;
    const lumo::support::TrnPtr psLongTrn =
        fnFit(sLongScene, psLongSeg.get(), Gcps(sLongScene.SamplePoints(8, 6, 0.0, 1000.0)));
    const auto* psLongModel = static_cast<const SRITInfo_t*>(psLongTrn->pModel);
    ASSERT_NE(psLongModel, nullptr);
    ASSERT_NE(psLongModel->padfLineShiftA, nullptr);
    EXPECT_EQ(psLongModel->padfLineShiftA[39999], 4.5);
}

}  // namespace
