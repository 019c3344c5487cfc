// The radar model on simulated zero-Doppler scenes of every kind (both look
// sides and range directions, ascending and descending, high latitude and
// across the 180th meridian): 12 control points, 100 independent check
// points, round trips, and the rational polynomial model against the
// model's own geometry.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include "lumo.h"
#include "radar_sim.h"
#include "rpc.h"
#include "support/radar_scene.h"

namespace {

using lumo::sim::RadarSceneParams;
using lumo::support::RadarFixture;

struct SceneCase {
    const char* pszName;
    RadarSceneParams sParams;
};

RadarSceneParams Scene(double dfLat, double dfLon, bool bAscending, bool bRight, bool bIncreasing,
                       double dfIncidence) {
    RadarSceneParams p;
    p.dfCentreLatDeg = dfLat;
    p.dfCentreLonDeg = dfLon;
    p.bAscending = bAscending;
    p.bRightLooking = bRight;
    p.bRangeIncreasing = bIncreasing;
    p.dfNearIncidenceDeg = dfIncidence;
    p.nPixels = 3000;
    p.nLines = 3000;
    return p;
}

std::vector<SceneCase> Cases() {
    return {
        {"descending right near", Scene(45.0, 10.0, false, true, true, 20.0)},
        {"ascending left far", Scene(-30.0, 140.0, true, false, true, 40.0)},
        {"descending left reversed", Scene(10.0, -60.0, false, false, false, 30.0)},
        {"ascending right reversed", Scene(50.0, -120.0, true, true, false, 25.0)},
        {"high latitude", Scene(76.0, 25.0, false, true, true, 30.0)},
        {"across 180", Scene(60.0, 180.0, true, true, true, 35.0)},
    };
}

class RadarScenes : public testing::TestWithParam<SceneCase> {};

// Image -> ground -> image distance of a point at its height, pixels (1e9
// when either way fails).
double RoundTrip(const RTCSInfo_t& sModel, const lumo::sim::SimPoint& s) {
    double x = 0, y = 0, p = 0, l = 0;
    const bool bOk = RTCSImg2Geo(&sModel, s.dfPixel, s.dfLine, s.dfZ, &x, &y) == 1 &&
                     RTCSGeo2Img(&sModel, x, y, s.dfZ, &p, &l) == 1;
    return bOk ? std::hypot(p - s.dfPixel, l - s.dfLine) : 1e9;
}

TEST_P(RadarScenes, CheckPointsRoundTripsAndRpcMeetTheirBounds) {
    const SceneCase& c = GetParam();
    const RadarFixture f(c.sParams, 12, 0.0, 1500.0);
    const RTCSInfo_t& m = f.Model();
    // The same model answering from its own geometry only.
    lumo::support::RadarModelPtr own(RTCSAllocate());
    RTCSCopy(own.get(), &m);
    delete own->poRpcModel;
    own->poRpcModel = nullptr;
    // Check points against the truth, and round trips.
    const std::vector<lumo::sim::SimPoint> asChecks =
        f.Scene().SamplePoints(100, 99, 0.0, 1500.0, 0.01);
    double dfSum = 0.0, dfTrip = 0.0, dfOwnTrip = 0.0, dfRpc = 0.0;
    for (const lumo::sim::SimPoint& s : asChecks) {
        double p = 0, l = 0;
        RTCSGeo2Img(&m, s.dfX, s.dfY, s.dfZ, &p, &l);
        dfSum += std::pow(p - s.dfPixel, 2) + std::pow(l - s.dfLine, 2);
        dfTrip = std::max(dfTrip, RoundTrip(m, s));
        dfOwnTrip = std::max(dfOwnTrip, RoundTrip(*own, s));
    }
    // The rational polynomials against the model's own geometry at ground
    // points of the raster from 500 m below to 3000 m above the control points.
    for (const lumo::sim::SimPoint& s : f.Scene().SamplePoints(400, 5, -500.0, 3000.0, 0.0)) {
        double lon = 0, lat = 0, p1 = 0, l1 = 0, p2 = 0, l2 = 0;
        if (RTCSImg2Geo(own.get(), s.dfPixel, s.dfLine, s.dfZ, &lon, &lat) != 1) continue;
        const bool bRpc = m.poRpcModel != nullptr &&
                          m.poRpcModel->GroundToImage(lon, lat, s.dfZ, p1, l1, false) == 0;
        RTCSGeo2Img(own.get(), lon, lat, s.dfZ, &p2, &l2);
        dfRpc = std::max(dfRpc, bRpc ? std::hypot(p1 - p2, l1 - l2) : 1e9);
    }
    const double dfRms = std::sqrt(dfSum / asChecks.size());
    std::printf("%-26s check rms %.3f px | round trip max %.2g (own %.2g) px | rpc max %.4f px\n",
                c.pszName, dfRms, dfTrip, dfOwnTrip, dfRpc);
    EXPECT_LE(dfRms, 1.0);
    EXPECT_LE(dfTrip, 0.1);
    EXPECT_LE(dfOwnTrip, 0.1);
    EXPECT_LE(dfRpc, 0.05);
}

INSTANTIATE_TEST_SUITE_P(Scenes, RadarScenes, testing::ValuesIn(Cases()),
                         [](const testing::TestParamInfo<SceneCase>& info) {
                             std::string name = info.param.pszName;
                             std::replace(name.begin(), name.end(), ' ', '_');
                             return name;
                         });

}  // namespace
