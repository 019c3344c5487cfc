// Accuracy of the rigorous model on simulated SPOT-5-like scenes: fit on ten
// exact control points, measure on one hundred independent check points.
#include <gtest/gtest.h>

#include <cmath>
#include <string>
#include <vector>

#include "lumo_ephemeris.h"
#include "lumo_sim.h"
#include "lumo_srit.h"
#include "support/model_records.h"
#include "support/sim_gcps.h"
#include "support/srit_block.h"

namespace {

using lumo::sim::Scene;
using lumo::sim::SceneParams;
using lumo::sim::SimPoint;

using ModelPtr = lumo::support::SritPtr;

struct Fit {
    ModelPtr psModel;
    double dfRms = 0.0;        // check RMS in pixels, SRITGeo2Img
    double dfExactRms = 0.0;   // the same through SRITGeo2ImgExact
    double dfRoundTrip = 0.0;  // largest SRITImg2GeoDem -> SRITGeo2Img miss, pixels
};

// Fits a model of the scene on nGcp points and measures it on nCheck others.
Fit FitScene(const SceneParams& sParams, int nGcp, int nCheck, double dfNoise, std::uint32_t nSeed,
             int32_t nForm = SRIT_FORM_CLASSIC) {
    const Scene sScene(sParams);
    std::vector<SimPoint> asGcp = sScene.SamplePoints(nGcp, nSeed, 0.0, 2000.0, 0.03);
    if (dfNoise > 0.0) lumo::sim::AddImageNoise(&asGcp, dfNoise, nSeed + 1);
    const std::vector<SimPoint> asCheck = sScene.SamplePoints(nCheck, nSeed + 2, 0.0, 2000.0, 0.01);
    const lumo::support::SimGcps g(asGcp);
    Fit sFit;
    sFit.psModel.reset(SRITAllocate());
    sFit.psModel->anAux[SRIT_AUX_FORM] = nForm;
    EphemerisSeg_t* psSeg = sScene.MakeSegment();
    EXPECT_EQ(SRITCalculate(sFit.psModel.get(), true, psSeg, nGcp, &sScene.Projection(), g.p.data(),
                            g.l.data(), g.z.data(), g.x.data(), g.y.data()),
              1);
    sFit.dfRms = lumo::support::CheckRms(sFit.psModel.get(), asCheck);
    sFit.dfExactRms = lumo::support::CheckRms(sFit.psModel.get(), asCheck, true);
    for (const SimPoint& s : asCheck) {
        double dfPixel = 0, dfLine = 0, dfZ = s.dfZ, dfX = 0, dfY = 0, dfP2 = 0, dfL2 = 0;
        SRITGeo2Img(sFit.psModel.get(), s.dfX, s.dfY, s.dfZ, &dfPixel, &dfLine);
        SRITImg2GeoDem(sFit.psModel.get(), dfPixel, dfLine, &dfZ, &dfX, &dfY);
        SRITGeo2Img(sFit.psModel.get(), dfX, dfY, s.dfZ, &dfP2, &dfL2);
        sFit.dfRoundTrip = std::max(sFit.dfRoundTrip, std::hypot(dfP2 - dfPixel, dfL2 - dfLine));
    }
    return sFit;
}

// SPOT-5-like scenes: 822 km altitude, 98.7 degrees inclination, descending
// pass at 45 N, 12 000 lines of 12 000 detectors of 5 m at nadir on a
// straight array, heights 0 to 2 000 m, 10 control points, 100 check points:
// exact control points at nadir and off nadir; a sensor row with eight
// unknowns, which keeps the second-order terms P8 ... P10 at their starting
// values from the orbit (a starting value off by the satellite's speed over
// its height puts such a fit hundreds of pixels out at the image corners);
// half-pixel Gaussian noise on the control points' image coordinates.
TEST(SRITAccuracy, CheckPointsOfSimulatedScenes) {
    struct Case {
        const char* pszSensor;
        double dfRoll, dfNoise;
        std::uint32_t nSeed;
        double dfTol;  // check RMS, pixels
    };
    std::vector<Case> aCases = {{"SPOT5_PAN_5", 0.0, 0.0, 11, 0.5},
                                {"SPOT5_PAN_5", 20.0, 0.0, 21, 0.5},
                                {"ASTER", 0.0, 0.0, 11, 0.1},
                                {"ASTER", 20.0, 0.0, 21, 0.5}};
    for (double dfRoll : {0.0, 20.0}) {
        for (std::uint32_t nSeed : {31u, 41u, 51u}) {
            aCases.push_back({"SPOT5_PAN_5", dfRoll, 0.5, nSeed, 1.0});
        }
    }
    for (const Case& c : aCases) {
        SCOPED_TRACE(std::string(c.pszSensor) + " roll " + std::to_string(c.dfRoll) + " noise " +
                     std::to_string(c.dfNoise) + " seed " + std::to_string(c.nSeed));
        SceneParams s;
        s.osSensorName = c.pszSensor;
        s.dfRollDeg = c.dfRoll;
        const Fit sFit = FitScene(s, 10, 100, c.dfNoise, c.nSeed);
        EXPECT_STREQ(sFit.psModel->Sensor, c.pszSensor);
        const bool bAster = s.osSensorName == "ASTER";
        if (bAster) {
            EXPECT_EQ(sFit.psModel->adfCoef[19], 0.0);  // P11 not adjusted
        }
        EXPECT_LE(sFit.dfRms, c.dfTol);
        // With exact control points and the full row the exact inverse is
        // never worse than the ground-to-image step. The two transforms are
        // approximate inverses: the round trip misses by tenths of a pixel off
        // nadir, hundredths at nadir.
        if (c.dfNoise == 0.0 && !bAster) {
            EXPECT_LE(sFit.dfExactRms, sFit.dfRms + 0.01);
        }
        EXPECT_LT(sFit.dfRoundTrip, c.dfRoll == 0.0 ? 0.1 : 1.0);
    }
}

// Exact control points on scenes centred on their zone's central meridian,
// where the map grid's scale is uniform to second order, so that what
// remains is the model's own error. With the curved elevation scale every
// roll from nadir to 40 degrees checks within a tenth of a pixel; the classic
// scale, blind to the growth of the incidence over the curved Earth, misses
// by half a pixel at 40 degrees.
TEST(SRITAccuracy, RollSweepWithTheCurvedElevationScale) {
    for (double dfRoll : {0.0, 10.0, 20.0, 30.0, 40.0}) {
        const SceneParams s = lumo::sim::AimAt(SceneParams(), 45.0, 9.0, dfRoll, 0.0);
        for (int nGcp : {10, 40}) {
            const Fit sFit = FitScene(s, nGcp, 100, 0.0, 21, SRIT_FORM_CURVED_INCIDENCE);
            EXPECT_LE(sFit.dfExactRms, 0.1) << dfRoll << " " << nGcp;
        }
    }
    const Fit sClassic = FitScene(lumo::sim::AimAt(SceneParams(), 45.0, 9.0, 40.0, 0.0), 10, 100,
                                  0.0, 21, SRIT_FORM_CLASSIC);
    EXPECT_GT(sClassic.dfExactRms, 0.3);
}

// The exact form inverts image to ground for every form of the equations
// (each has its own derivatives): general, no curvature (class 2), the cubic
// terms of class 5, the radar-like class 6, the P12 term, the linear form and
// the lens correction. A ground point far outside the model is a failure.
TEST(SRITAccuracy, ExactTransformInvertsEveryForm) {
    SceneParams s;
    s.dfRollDeg = 20.0;
    const Fit sFit = FitScene(s, 10, 10, 0.0, 61);
    const struct {
        int nClass, nSensor, nCoef;
        double dfValue;
    } aForms[] = {
        {1, 55, 18, 0.0},   {2, 55, 18, 0.0},  {5, 55, 21, 1e-14},
        {6, 55, 21, 1e-14}, {1, 55, 18, 1e-3},  // the P12 term
        {1, 30, 18, 0.0},                       // TM: the linear form
        {1, 50, 18, 0.0},                       // the lens-corrected camera
    };
    std::vector<ModelPtr> apsModels;
    for (const auto& f : aForms) {
        apsModels.emplace_back(SRITAllocate());
        SRITCopy(apsModels.back().get(), sFit.psModel.get());
        apsModels.back()->nModelClass = f.nClass;
        apsModels.back()->nSensor = f.nSensor;
        apsModels.back()->adfCoef[f.nCoef] = f.dfValue;
        if (f.nClass == 5) {
            apsModels.back()->adfCoef[20] = 1e-14;
            apsModels.back()->adfCoef[22] = 1e-8;
        }
    }
    for (std::size_t k = 0; k < apsModels.size(); ++k) {
        const SRITInfo_t* psModel = apsModels[k].get();
        for (double dfPixel : {0.0, 3000.5, 11999.0}) {
            for (double dfLine : {0.0, 6000.25, 11999.0}) {
                for (double dfZ : {-200.0, 2500.0}) {
                    double dfX = 0, dfY = 0, dfP = 0, dfL = 0;
                    ASSERT_EQ(SRITImg2Geo_imp(psModel, dfPixel, dfLine, dfZ, &dfX, &dfY), 1);
                    ASSERT_EQ(SRITGeo2ImgExact(psModel, dfX, dfY, dfZ, &dfP, &dfL), 1) << k;
                    EXPECT_NEAR(dfP, dfPixel, 1e-6) << k;
                    EXPECT_NEAR(dfL, dfLine, 1e-6) << k;
                }
            }
        }
        double dfP = 0, dfL = 0;
        EXPECT_EQ(SRITGeo2ImgExact(psModel, 1e12, 1e12, 0.0, &dfP, &dfL), 0) << k;
        EXPECT_EQ(dfP, LUMO_NULL_VALUE);
    }
}

}  // namespace
