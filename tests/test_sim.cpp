// The scene simulator: exact image coordinates, segment consistency, and
// rejection of bad parameters.
#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <stdexcept>
#include <string>
#include <vector>

#include "lumo_ephemeris.h"
#include "lumo_sim.h"
#include "support/model_records.h"

namespace {

using lumo::sim::Ecef;
using lumo::sim::Scene;
using lumo::sim::SceneParams;

constexpr double kDeg = 3.14159265358979323846 / 180.0;

TEST(SimGeodesy, GeodeticRoundTripAndKnownValues) {
    // The equator at Greenwich and the pole have known Earth-fixed positions.
    const Ecef sEq = lumo::sim::GeodeticToEcef(0.0, 0.0, 0.0);
    EXPECT_DOUBLE_EQ(sEq.x, 6378137.0);
    const Ecef sPole = lumo::sim::GeodeticToEcef(90.0 * kDeg, 0.0, 0.0);
    EXPECT_NEAR(sPole.z, 6356752.314245, 1e-6);
    for (double dfLat : {-60.0, -1.0, 0.5, 45.0, 80.0}) {
        for (double dfH : {-100.0, 0.0, 2500.0, 822000.0}) {
            double dfLat2 = 0, dfLon2 = 0, dfH2 = 0;
            lumo::sim::EcefToGeodetic(lumo::sim::GeodeticToEcef(dfLat * kDeg, 0.3, dfH), &dfLat2,
                                      &dfLon2, &dfH2);
            EXPECT_NEAR(dfLat2, dfLat * kDeg, 1e-14);
            EXPECT_NEAR(dfLon2, 0.3, 1e-15);
            EXPECT_NEAR(dfH2, dfH, 1e-7);
        }
    }
}

TEST(SimScene, ImageGroundRoundTripIsExact) {
    for (double dfRoll : {0.0, 20.0, -15.0}) {
        SceneParams sParams;
        sParams.dfRollDeg = dfRoll;
        sParams.dfPitchDeg = dfRoll == -15.0 ? 10.0 : 0.0;
        const Scene sScene(sParams);
        for (const auto& s : sScene.SamplePoints(25, 7, 0.0, 2000.0)) {
            double dfPixel = 0, dfLine = 0;
            ASSERT_TRUE(sScene.GroundToImage(s.dfX, s.dfY, s.dfZ, &dfPixel, &dfLine));
            EXPECT_NEAR(dfPixel, s.dfPixel, 1e-5) << "roll " << dfRoll;
            EXPECT_NEAR(dfLine, s.dfLine, 1e-5) << "roll " << dfRoll;
        }
        // A higher point seen in the same pixel lies closer to the sensor:
        // with a roll towards higher pixels it moves towards lower eastings.
        double dfX0 = 0, dfY0 = 0, dfX1 = 0, dfY1 = 0;
        ASSERT_TRUE(sScene.ImageToGround(6000, 6000, 0.0, &dfX0, &dfY0));
        ASSERT_TRUE(sScene.ImageToGround(6000, 6000, 1000.0, &dfX1, &dfY1));
        if (dfRoll == 20.0) {
            EXPECT_NEAR(dfX0 - dfX1, 1000.0 * std::tan(20.0 * kDeg), 40.0);
        }
        if (dfRoll == 0.0) {
            EXPECT_LT(std::abs(dfX0 - dfX1), 20.0);
        }
    }
}

TEST(SimScene, SegmentMatchesTheGeometry) {
    SceneParams sParams;
    sParams.dfRollDeg = 20.0;
    const Scene sScene(sParams);
    const lumo::support::SegmentPtr psSeg(sScene.MakeSegment());
    EXPECT_STREQ(psSeg->szGeosys, "UTM 32 T D000");  // 20 degrees east of nadir at 3 E
    EXPECT_DOUBLE_EQ(psSeg->dfViewAngle, 20.0 * kDeg);
    EXPECT_EQ(psSeg->nNumLines, sParams.nLines);
    // Circular orbit: no radial velocity; 822 km orbit has a period near
    // 101 minutes.
    EXPECT_EQ(psSeg->dfSatVelocity, 0.0);
    EXPECT_NEAR(2 * 3.14159265358979 / psSeg->dfAngularSpeed / 60.0, 101.4, 0.2);
    // Off nadir the pixel is the slant range times the IFOV over the cosine
    // of the incidence angle (spherical Earth of the centre's radius).
    const double dfR = psSeg->dfOrbitRadius - psSeg->dfSatHeight;
    const double dfIncidence = std::asin(psSeg->dfOrbitRadius / dfR * std::sin(20.0 * kDeg));
    const double dfSlant = dfR * std::sin(dfIncidence - 20.0 * kDeg) / std::sin(20.0 * kDeg);
    EXPECT_NEAR(psSeg->dfPixelRes, dfSlant * psSeg->dfIFOV / std::cos(dfIncidence), 0.03);
    EXPECT_NEAR(psSeg->dfLineRes, 5.0, 0.5);
    // The stated centre latitude is the ground position of the centre pixel.
    double dfX = 0, dfY = 0, dfPixel = 0, dfLine = 0;
    ASSERT_TRUE(sScene.ImageToGround(6000, 6000, 0.0, &dfX, &dfY));
    ASSERT_TRUE(sScene.GroundToImage(dfX, dfY, 0.0, &dfPixel, &dfLine));
    EXPECT_NEAR(dfPixel, 6000, 1e-6);
    double dfLat = 0, dfLon = 0;
    sScene.CentreGeodetic(&dfLat, &dfLon);
    EXPECT_DOUBLE_EQ(psSeg->dfCentreLatitude, dfLat);
    // Roll to the east of a descending pass: the centre lies east of nadir.
    EXPECT_GT(dfLon / kDeg, 3.0 + 2.0);
}

TEST(SimScene, BadParametersAreRejectedByName) {
    const struct {
        std::function<void(SceneParams&)> spoil;
        const char* pszName;
    } cases[] = {
        {[](SceneParams& s) { s.dfOrbitRadius = 6000000.0; }, "orbit radius"},
        {[](SceneParams& s) { s.dfNadirLatitudeDeg = 84.0; }, "nadir latitude"},
        {[](SceneParams& s) { s.dfIFOV = std::nan(""); }, "IFOV"},
        {[](SceneParams& s) { s.nPixels = 1; }, "pixel count"},
        {[](SceneParams& s) { s.osSensorName = "A_SENSOR_NAME_TOO_LONG"; }, "sensor name length"},
    };
    for (const auto& c : cases) {
        SceneParams s;
        c.spoil(s);
        try {
            Scene sScene(s);
            ADD_FAILURE() << "accepted " << c.pszName;
        } catch (const std::invalid_argument& e) {
            EXPECT_NE(std::string(e.what()).find(c.pszName), std::string::npos) << e.what();
        }
    }
    const Scene sScene{SceneParams()};
    EXPECT_THROW(sScene.SamplePoints(5, 1, 100.0, 0.0), std::invalid_argument);
    std::vector<lumo::sim::SimPoint> asPoints(2);
    EXPECT_THROW(lumo::sim::AddImageNoise(&asPoints, -1.0, 1), std::invalid_argument);
}

}  // namespace
