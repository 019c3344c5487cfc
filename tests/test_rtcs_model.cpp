// The radar model: on simulated zero-Doppler scenes of every kind (both look
// sides and range directions, ascending and descending, high latitude and
// across the 180th meridian) 12 control points, 100 independent check
// points, round trips, and the rational polynomial model against the
// model's own geometry; its generation from bad segments and points, the
// transforms' failure values, the stereo height, and the model's place in
// the dispatch, the transform container and the math model object.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <memory>
#include <string>
#include <vector>

#include "crs.h"
#include "dem.h"
#include "lumo.h"
#include "radar_sim.h"
#include "rpc.h"
#include "runtime.h"
#include "support/model_records.h"
#include "support/numbered_error.h"
#include "support/radar_scene.h"

namespace {

using lumo::support::AsControlPoints;
using lumo::support::GeographicProjection;
using lumo::support::RadarFixture;
using lumo::support::RadarModelPtr;
using lumo::support::RadarSegmentPtr;

lumo::sim::RadarSceneParams SmallScene() {
    lumo::sim::RadarSceneParams p;
    p.nPixels = 800;
    p.nLines = 600;
    return p;
}

const RadarFixture& Fixture() {
    static const RadarFixture f(SmallScene(), 12, 0.0, 1500.0);
    return f;
}

RadarSegmentPtr CopySegment() {
    return RadarSegmentPtr(EphemerisSegDuplicate(&Fixture().Segment()));
}

RadarLine_t* Lines(EphemerisSeg_t* psSeg) {
    return static_cast<RadarData_t*>(*psSeg->ppOrbitData)->pLinePositions;
}

std::vector<ControlPoint_t> Gcps() {
    return AsControlPoints(Fixture().Gcps());
}

// Generation of a broken segment or point set fails with fatal error `code`
// whose text names `what`.
void ExpectRefused(const EphemerisSeg_t* psSeg, const std::vector<ControlPoint_t>& aoGcps,
                   int nCode, const std::string& osWhat) {
    const auto [nGot, osText] = lumo::support::FatalOf(
        [&] { RadarModelPtr(RTCSGenModel(psSeg, GeographicProjection(), "E", aoGcps)); });
    EXPECT_EQ(nGot, nCode) << osWhat;
    EXPECT_NE(osText.find(osWhat), std::string::npos) << osWhat << ": " << osText;
}

TEST(RtcsModel, BadSegmentsAndPointsAreRefusedByName) {
    const std::pair<void (*)(EphemerisSeg_t&), const char*> aBad[] = {
        {[](EphemerisSeg_t& s) { s.nNumPixels = 0; }, "nNumPixels 0"},
        {[](EphemerisSeg_t& s) { s.nNumLines += 1; }, "holds 600 lines for nNumLines 601"},
        {[](EphemerisSeg_t& s) { Lines(&s)[17].fLatMid = std::nanf(""); }, "pLinePositions[17]"},
        {[](EphemerisSeg_t& s) { Lines(&s)[3].nRangeLast = -5; }, "pLinePositions[3]"},
    };
    for (const auto& [fnEdit, pszWhat] : aBad) {
        RadarSegmentPtr s = CopySegment();
        fnEdit(*s);
        ExpectRefused(s.get(), Gcps(), 11, pszWhat);
    }
    RadarSegmentPtr s = CopySegment();
    s->nOrbitType = EPH_ORBIT_NONE;
    ExpectRefused(s.get(), Gcps(), 11, "no radar line table");
    s->nOrbitType = EPH_ORBIT_RADAR;  // the release frees the sub-record by its kind
    std::vector<ControlPoint_t> g = Gcps();
    g[4].dfImageX = -1.0;
    ExpectRefused(&Fixture().Segment(), g, 189, "X_img");
}

TEST(RtcsModel, GenerationEdgeCases) {
    RadarSegmentPtr s = CopySegment();
    s->nBytesPerPixel = 5;
    testing::internal::CaptureStdout();
    RadarModelPtr m(RTCSGenModel(s.get(), GeographicProjection(), "e", {}));
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "Number of Bytes Per Pixel is Invalid \n");
    EXPECT_EQ(m->osHeightRef, "E");
    EXPECT_EQ(m->nRangeDirection, 1);
    // Without control points the segment's positions carry the model.
    const lumo::sim::SimPoint c = Fixture().Scene().SamplePoints(1, 3, 750.0, 750.0, 0.2)[0];
    double p = 0, l = 0;
    ASSERT_EQ(RTCSGeo2Img(m.get(), c.dfX, c.dfY, c.dfZ, &p, &l), 1);
    EXPECT_LT(std::hypot(p - c.dfPixel, l - c.dfLine), 1.0);
    // No height reference is mean sea level.
    RadarModelPtr msl(RTCSGenModel(&Fixture().Segment(), GeographicProjection(), "", {}));
    EXPECT_EQ(msl->osHeightRef, "M");
}

TEST(RtcsModel, MeanSeaLevelModelsTakeMeanSeaLevelHeights) {
    // Control and check points with heights above mean sea level (EGM96).
    nova::dem::DEMPtr geoid(nova::dem::DEMFactory::CreateGlobalDEM(true, 4));
    ASSERT_TRUE(geoid);
    const auto toMsl = [&](std::vector<lumo::sim::SimPoint> a) {
        for (auto& s : a) {
            double n = 0;
            EXPECT_TRUE(geoid->GetHeight(s.dfX, s.dfY, n));
            s.dfZ -= n;
        }
        return a;
    };
    RadarModelPtr m(RTCSGenModel(&Fixture().Segment(), GeographicProjection(), "M",
                                 AsControlPoints(toMsl(Fixture().Gcps()))));
    for (const auto& c : toMsl(Fixture().Scene().SamplePoints(20, 4, 0.0, 1500.0))) {
        double p = 0, l = 0, x = 0, y = 0;
        ASSERT_EQ(RTCSGeo2Img(m.get(), c.dfX, c.dfY, c.dfZ, &p, &l), 1);
        EXPECT_LT(std::hypot(p - c.dfPixel, l - c.dfLine), 1.0);
        ASSERT_EQ(RTCSImg2Geo(m.get(), c.dfPixel, c.dfLine, c.dfZ, &x, &y), 1);
        EXPECT_LT(std::hypot((x - c.dfX) * 78000.0, (y - c.dfY) * 111000.0), 15.0);
    }
    // The model object declares the heights the model takes.
    const nova::mathmodel::LumoMathModel o(nova::mathmodel::LUMO_MODEL_RTCS, m.get());
    EXPECT_EQ(o.GetCRS()->GetVerticalDatumType(), nova::ogc::cs::CS_VD_Orthometric);
}

TEST(RtcsModel, CopiesAreDeepAndTransformsReportFailure) {
    RadarModelPtr empty(RTCSAllocate());
    double p = 7, l = 7, x = 7, y = 7;
    EXPECT_EQ(RTCSGeo2Img(empty.get(), 10.0, 45.0, 0.0, &p, &l), 0);  // not generated
    EXPECT_EQ(p, LUMO_NULL_VALUE);
    RadarModelPtr copy(RTCSAllocate());
    RTCSCopy(copy.get(), &Fixture().Model());
    RTCSCopy(copy.get(), copy.get());  // no change
    copy->osHeightRef = "e";
    RadarModelPtr again(RTCSAllocate());
    RTCSCopy(again.get(), copy.get());
    copy.reset();
    EXPECT_EQ(again->osHeightRef, "E");
    const lumo::sim::SimPoint& g = Fixture().Gcps()[3];
    double p0 = 0, l0 = 0, p1 = 0, l1 = 0;
    RTCSGeo2Img(&Fixture().Model(), g.dfX, g.dfY, 0.0, &p0, &l0);
    ASSERT_EQ(RTCSGeo2Img(again.get(), g.dfX, g.dfY, LUMO_NULL_VALUE, &p1, &l1), 1);
    EXPECT_EQ(p0, p1);  // -1e20 is height 0, and the copy answers alike
    EXPECT_EQ(RTCSImg2Geo(again.get(), 100.0, 100.0, LUMO_NULL_VALUE, &x, &y), 0);
    EXPECT_EQ(x, LUMO_NULL_VALUE);
    double z = LUMO_NULL_VALUE;
    EXPECT_EQ(RTCSImg2GeoDem(again.get(), 100.0, 100.0, &z, &x, &y), 1);
    EXPECT_EQ(z, 0.0);
    // The quarter-line intersection: line coordinate nLines and a failed
    // quarter line give no point.
    EXPECT_EQ(RTCSCalGeodetic(again.get(), 10.0, 600.0, 0.0, &x, &y), 0);
    EXPECT_EQ(RTCSCalGeodetic(again.get(), 10.0, 5.0, 750.0, &x, &y), 1);
    again->padfQStepCoefs[3 * 20] = RTCS_FAILED_QUARTER;
    EXPECT_EQ(RTCSCalGeodetic(again.get(), 10.0, 5.0, 750.0, &x, &y), 0);
}

TEST(RtcsModel, StereoPairGivesTheHeight) {
    lumo::sim::RadarSceneParams b = SmallScene();
    b.dfNearIncidenceDeg = 45.0;
    b.bAscending = true;
    b.bRightLooking = false;
    const RadarFixture &fa = Fixture(), fb(b, 12, 0.0, 1500.0);
    for (double dfHeight : {120.0, 1300.0}) {
        double lon = 0, lat = 0, p1 = 0, l1 = 0, p2 = 0, l2 = 0;
        fa.Scene().ImageToGround(300.0, 250.0, dfHeight, &lon, &lat);
        fa.Scene().GroundToImage(lon, lat, dfHeight, &p1, &l1);
        ASSERT_TRUE(fb.Scene().GroundToImage(lon, lat, dfHeight, &p2, &l2));
        double x = 0, y = 0, z = 0;
        ASSERT_EQ(RTCSDetGeo(&fa.Model(), &fb.Model(), p1, l1, p2, l2, x, y, z), 1);
        EXPECT_NEAR(z, dfHeight, 10.0);
        EXPECT_NEAR((x - lon) * 78000.0, 0.0, 30.0);
        EXPECT_NEAR((y - lat) * 111000.0, 0.0, 30.0);
    }
}

// An option block with the line positions of the fixture's segment, as the
// transform container takes it.
RTCSCOpt_t* ImageDescription() {
    RadarModelPtr m(RTCSAllocate());
    RTCSCopy(m.get(), &Fixture().Model());
    RTCSCOpt_t* psOpt = m->psCOpt;
    m->psCOpt = nullptr;
    return psOpt;
}

TEST(RtcsModel, ContainerDispatchAndModelObject) {
    lumo::support::TrnPtr trn(TRNAllocate(TRN_RTCS));
    const auto& g = Fixture().Gcps();
    std::vector<double> x, y, z, p, l;
    for (const auto& s : g)
        x.push_back(s.dfX), y.push_back(s.dfY), z.push_back(s.dfZ), p.push_back(s.dfPixel),
            l.push_back(s.dfLine);
    std::vector<double> bad = p;
    bad[0] = 1e9;
    EXPECT_THROW(TRNCalculate3D(trn.get(), 12, x.data(), y.data(), z.data(), bad.data(), l.data(),
                                nullptr, ImageDescription()),
                 nova::NumberedError);  // the block is released all the same
    EXPECT_EQ(trn->bCalculated, 0);
    RTCSCOpt_t* psNaN = ImageDescription();
    psNaN->sLines.padfLatMid[17] = std::nan("");
    const std::string osNaN = lumo::support::FatalOf([&] {
                                  TRNCalculate3D(trn.get(), 12, x.data(), y.data(), z.data(),
                                                 p.data(), l.data(), nullptr, psNaN);
                              }).second;
    EXPECT_NE(osNaN.find("LatMid of line 17"), std::string::npos) << osNaN;
    TRNCalculate3D(trn.get(), 12, x.data(), y.data(), z.data(), p.data(), l.data(), nullptr,
                   ImageDescription());
    ASSERT_EQ(trn->bCalculated, 1);
    const lumo::sim::SimPoint c = Fixture().Scene().SamplePoints(1, 8, 900.0, 900.0, 0.2)[0];
    double tp = 0, tl = 0, tz = 5, dp = 0, dl = 0;
    ASSERT_EQ(TRNTransform3D(trn.get(), c.dfX, c.dfY, c.dfZ, &tp, &tl, &tz), 1);
    EXPECT_EQ(tz, 0.0);
    EXPECT_LT(std::hypot(tp - c.dfPixel, tl - c.dfLine), 1.0);
    RTCSGeo2Img(&Fixture().Model(), c.dfX, c.dfY, c.dfZ, &dp, &dl);
    double rx = 5, ry = 5;
    TRNRMSError(trn.get(), 12, x.data(), y.data(), p.data(), l.data(), &rx, &ry);
    EXPECT_EQ(rx, 0.0);

    const nova::mathmodel::LumoMathModel o(nova::mathmodel::LUMO_MODEL_RTCS, &Fixture().Model());
    EXPECT_EQ(o.GetCRS()->GetVerticalDatumType(), nova::ogc::cs::CS_VD_Ellipsoidal);
    EXPECT_EQ(o.GetNumColumns(), 800);
    EXPECT_EQ(o.GetNumRows(), 600);
    double op = 0, ol = 0;
    ASSERT_EQ(o.GroundToImage(c.dfX, c.dfY, c.dfZ, op, ol, false), 0);
    EXPECT_EQ(op, dp);
}

TEST(RtcsModel, NominalControlPointsMoveAlongConstantRange) {
    const lumo::sim::RadarScene& sc = Fixture().Scene();
    const double h0 = Fixture().Model().psCOpt->dfAvgHt;
    // Two rows of five nominal points across lines 100 and 400 at the
    // reference height; the second point of the second row cannot move.
    std::vector<double> lon, lat, h, a, b, c;
    std::vector<int> ids;
    for (double line : {100.0, 400.0}) {
        for (int k = 0; k < 5; ++k) {
            double x = 0, y = 0;
            ASSERT_TRUE(sc.ImageToGround(k * 799.0 / 4, line, h0, &x, &y));
            lon.push_back(x), lat.push_back(y), h.push_back(h0), a.push_back(k * 799.0 / 4);
            b.push_back(line), c.push_back(0.0), ids.push_back(100 + static_cast<int>(ids.size()));
        }
    }
    lat[6] = std::nan("");
    const RadarLine_t first = Lines(CopySegment().get())[0];
    // Raises nCount points in nRows rows of nCols to 1000 m; the count kept.
    auto Raise = [&](int nRows, int nCols, int nCount) {
        RTCSAddElevationsToNominalGCPs(1000.0, nRows, nCols, first.nRangeFirst, first.nRangeLast,
                                       6378137.0, 6356752.314245179, &nCount, ids.data(), a.data(),
                                       b.data(), c.data(), lon.data(), lat.data(), h.data());
        return nCount;
    };
    EXPECT_EQ(Raise(1, 1, 1), 0);  // one column makes no row
    const int count = Raise(2, 5, 10);
    ASSERT_EQ(count, 9);
    EXPECT_EQ(ids[5], 105);  // untouched before the dropped point
    EXPECT_EQ(ids[6], 7);    // then numbered by place
    EXPECT_EQ(ids[8], 9);
    for (int i = 0; i < count; ++i) {
        // A point moved along its slant range is imaged where it was.
        double p = 0, l = 0;
        EXPECT_EQ(h[i], 1000.0);
        ASSERT_TRUE(sc.GroundToImage(lon[i], lat[i], 1000.0, &p, &l));
        EXPECT_LT(std::fabs(p - a[i]), 4.0) << i;
        EXPECT_LT(std::fabs(l - b[i]), 1.0) << i;
    }
}

// Image -> ground -> image distance of a point at its height, pixels (1e9
// when either way fails).
double RoundTrip(const RTCSInfo_t& sModel, const lumo::sim::SimPoint& s) {
    double x = 0, y = 0, p = 0, l = 0;
    const bool bOk = RTCSImg2Geo(&sModel, s.dfPixel, s.dfLine, s.dfZ, &x, &y) == 1 &&
                     RTCSGeo2Img(&sModel, x, y, s.dfZ, &p, &l) == 1;
    return bOk ? std::hypot(p - s.dfPixel, l - s.dfLine) : 1e9;
}

// A scene's model against the truth at 100 check points, its round trips
// with and without its rational polynomials, and those polynomials against
// the model's own geometry.
void ExpectWithinBounds(const RadarFixture& f) {
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
    EXPECT_LE(std::sqrt(dfSum / asChecks.size()), 1.0);
    EXPECT_LE(dfTrip, 0.1);
    EXPECT_LE(dfOwnTrip, 0.1);
    EXPECT_LE(dfRpc, 0.05);
}

// Scenes of every kind: both look sides and range directions, ascending and
// descending, high latitude and across the 180th meridian.
TEST(RtcsModel, ScenesMeetCheckPointRoundTripAndRpcBounds) {
    struct SceneCase {
        const char* pszName;
        double dfLat, dfLon;
        bool bAscending, bRight, bIncreasing;
        double dfIncidence;
    };
    const SceneCase aScenes[] = {
        {"descending right near", 45.0, 10.0, false, true, true, 20.0},
        {"ascending left far", -30.0, 140.0, true, false, true, 40.0},
        {"descending left reversed", 10.0, -60.0, false, false, false, 30.0},
        {"ascending right reversed", 50.0, -120.0, true, true, false, 25.0},
        {"high latitude", 76.0, 25.0, false, true, true, 30.0},
        {"across 180", 60.0, 180.0, true, true, true, 35.0},
    };
    for (const SceneCase& c : aScenes) {
        SCOPED_TRACE(c.pszName);
        lumo::sim::RadarSceneParams sParams;
        sParams.dfCentreLatDeg = c.dfLat;
        sParams.dfCentreLonDeg = c.dfLon;
        sParams.bAscending = c.bAscending;
        sParams.bRightLooking = c.bRight;
        sParams.bRangeIncreasing = c.bIncreasing;
        sParams.dfNearIncidenceDeg = c.dfIncidence;
        sParams.nPixels = sParams.nLines = 3000;
        ExpectWithinBounds(RadarFixture(sParams, 12, 0.0, 1500.0));
    }
}

}  // namespace
