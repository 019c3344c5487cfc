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

TEST_P(RadarScenes, CheckPointsRoundTripsAndRpcMeetTheirBounds) {
    const SceneCase& c = GetParam();
    RadarFixture f(c.sParams, 12, 0.0, 1500.0);
    const lumo::support::RadarFigures r = f.Measure(100, -500.0, 3000.0);
    std::printf(
        "%-26s check rms %.3f max %.3f px | round trip max %.2g (own %.2g) px | rpc "
        "inside max %.4f px, grid max %.3f px\n",
        c.pszName, r.dfCheckRms, r.dfCheckMax, r.dfRoundTripMax, r.dfOwnRoundTripMax,
        r.dfRpcInsideMax, r.dfRpcGridMax);
    EXPECT_LE(r.dfCheckRms, 1.0);
    EXPECT_LE(r.dfRoundTripMax, 0.1);
    EXPECT_LE(r.dfOwnRoundTripMax, 0.1);
    EXPECT_LE(r.dfRpcInsideMax, 0.05);
}

INSTANTIATE_TEST_SUITE_P(Scenes, RadarScenes, testing::ValuesIn(Cases()),
                         [](const testing::TestParamInfo<SceneCase>& info) {
                             std::string name = info.param.pszName;
                             std::replace(name.begin(), name.end(), ' ', '_');
                             return name;
                         });

}  // namespace
