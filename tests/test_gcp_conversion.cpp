// Control point conversion to WGS 84 ellipsoidal coordinates: vertical
// datums, projected input, and every failure path.
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <string>
#include <vector>

#include "cli.h"
#include "lumo_gcp.h"
#include "points_io.h"
#include "projection.h"
#include "runtime.h"
#include "support/cli_runner.h"
#include "support/proj_without_geoid.h"

namespace {

ProjInfo_t Projection(const char* pszGeosys) {
    ProjInfo_t sProj{};
    EXPECT_EQ(Geosys2ProjInfo(&sProj, pszGeosys, 0.0, 0.0, 1.0, 1.0), 0) << pszGeosys;
    return sProj;
}

void ExpectSameImage(const std::vector<ControlPoint_t>& asOut,
                     const std::vector<ControlPoint_t>& asIn) {
    ASSERT_EQ(asOut.size(), asIn.size());
    for (std::size_t i = 0; i < asIn.size(); ++i) {
        EXPECT_EQ(asOut[i].dfImageX, asIn[i].dfImageX);
        EXPECT_EQ(asOut[i].dfImageY, asIn[i].dfImageY);
    }
}

// Bit for bit: a failed conversion leaves every point as it was.
void ExpectUnchanged(const std::vector<ControlPoint_t>& asOut,
                     const std::vector<ControlPoint_t>& asIn) {
    ASSERT_EQ(asOut.size(), asIn.size());
    EXPECT_EQ(std::memcmp(asOut.data(), asIn.data(), asIn.size() * sizeof(ControlPoint_t)), 0);
}

// Mean sea level heights ("M") gain the geoid undulation, any other height
// reference is ellipsoidal; projected input lands where the host's planar
// reprojection puts it; image coordinates never change.
TEST(GcpConversion, HeightReferencesAndProjectedInput) {
    const ProjInfo_t sLonLat = Projection("LONG/LAT D000");
    const std::vector<ControlPoint_t> asIn = {
        {10.0, 20.0, 5.0, 52.0, 0.0},    // the Netherlands
        {30.0, 40.0, 78.0, -5.0, 0.0},   // Indian Ocean geoid low
        {50.0, 60.0, 78.0, -5.0, 250.0}  // heights add to the undulation
    };
    std::vector<ControlPoint_t> asGcps = asIn;
    ConvertGcpsToWgs84Ell(sLonLat, "M", asGcps);
    ExpectSameImage(asGcps, asIn);
    for (std::size_t i = 0; i < asIn.size(); ++i) {
        EXPECT_NEAR(asGcps[i].dfGroundX, asIn[i].dfGroundX, 1e-9);
        EXPECT_NEAR(asGcps[i].dfGroundY, asIn[i].dfGroundY, 1e-9);
    }
    EXPECT_NEAR(asGcps[0].dfGroundZ, 43.4, 0.5);
    EXPECT_NEAR(asGcps[1].dfGroundZ, -91.8, 0.5);
    EXPECT_NEAR(asGcps[2].dfGroundZ - asGcps[1].dfGroundZ, 250.0, 1e-6);
    for (const char* pszRef : {"m", "E", "", "M ", "MSL"}) {
        std::vector<ControlPoint_t> asEll = asIn;
        ConvertGcpsToWgs84Ell(sLonLat, pszRef, asEll);
        for (std::size_t i = 0; i < asIn.size(); ++i) {
            EXPECT_NEAR(asEll[i].dfGroundZ, asIn[i].dfGroundZ, 1e-6) << pszRef;
        }
    }
    std::vector<ControlPoint_t> asEmpty;
    ConvertGcpsToWgs84Ell(sLonLat, "M", asEmpty);
    EXPECT_TRUE(asEmpty.empty());

    const ProjInfo_t sUtm = Projection("UTM 31 D000");
    const std::vector<ControlPoint_t> asUtm = {{1.0, 2.0, 500000.0, 5761000.0, 100.0},
                                               {3.0, 4.0, 650000.0, 5600000.0, -20.0}};
    // Projected input: the horizontal part as the host's planar reprojection
    // puts it.
    std::vector<ControlPoint_t> asOut = asUtm;
    ConvertGcpsToWgs84Ell(sUtm, "E", asOut);
    ExpectSameImage(asOut, asUtm);
    for (std::size_t i = 0; i < asUtm.size(); ++i) {
        double dfLon = 0.0, dfLat = 0.0;
        ASSERT_EQ(
            GCTPTransform(&sUtm, asUtm[i].dfGroundX, asUtm[i].dfGroundY, &sLonLat, &dfLon, &dfLat),
            0);
        EXPECT_NEAR(asOut[i].dfGroundX, dfLon, 1e-9);
        EXPECT_NEAR(asOut[i].dfGroundY, dfLat, 1e-9);
        EXPECT_NEAR(asOut[i].dfGroundZ, asUtm[i].dfGroundZ, 1e-6);
    }
    // Mean sea level on a projected system gains the undulation too: 44.07 m
    // near 3 E 52 N.
    asOut = asUtm;
    ConvertGcpsToWgs84Ell(sUtm, "M", asOut);
    EXPECT_NEAR(asOut[0].dfGroundZ, 100.0 + 44.07, 0.5);
}

TEST(GcpConversion, ProjectionWithoutCoordinateSystemIsAParameterError) {
    ProjInfo_t sPixel{};
    InitProjInfo(&sPixel, 1);
    const std::vector<ControlPoint_t> asIn = {{1.0, 2.0, 3.0, 4.0, 5.0}};
    std::vector<ControlPoint_t> asGcps = asIn;
    try {
        ConvertGcpsToWgs84Ell(sPixel, "E", asGcps);
        ADD_FAILURE() << "no exception";
    } catch (const nova::ParameterException& e) {
        EXPECT_EQ(e.GetParameterName(), "sProj");
        EXPECT_NE(e.GetMessage().find("\"PIXEL\""), std::string::npos) << e.GetMessage();
    }
    ExpectUnchanged(asGcps, asIn);
}

TEST(GcpConversion, PointThatCannotBeTransformedChangesNothing) {
    const ProjInfo_t sLonLat = Projection("LONG/LAT D000");
    const std::vector<ControlPoint_t> asIn = {{1.0, 2.0, 5.0, 52.0, 0.0},
                                              {3.0, 4.0, 5.0, 95.0, 0.0},  // beyond the pole
                                              {5.0, 6.0, 6.0, 51.0, 0.0}};
    for (const char* pszRef : {"M", "E"}) {
        std::vector<ControlPoint_t> asGcps = asIn;
        try {
            ConvertGcpsToWgs84Ell(sLonLat, pszRef, asGcps);
            ADD_FAILURE() << "no exception";
        } catch (const nova::DataException& e) {
            EXPECT_NE(e.GetMessage().find("GCP 2 "), std::string::npos) << e.GetMessage();
            EXPECT_NE(e.GetMessage().find("Y 95"), std::string::npos) << e.GetMessage();
        }
        ExpectUnchanged(asGcps, asIn);
    }
}

// Without the geoid model no transformation from mean sea level heights
// exists (rather than one that copies heights unchanged): the documented
// exception, even for an empty vector.
TEST(GcpConversion, MissingGeoidModelThrowsTheHostException) {
    const std::vector<ControlPoint_t> asIn = {{1.0, 2.0, 5.0, 52.0, 0.0}};
    const bool bRan = lumo::support::RunWithoutGeoid("gcp", [&] {
        const ProjInfo_t sLonLat = Projection("LONG/LAT D000");
        std::vector<ControlPoint_t> asGcps = asIn;
        try {
            ConvertGcpsToWgs84Ell(sLonLat, "M", asGcps);
            ADD_FAILURE() << "no exception";
        } catch (const nova::Exception& e) {
            EXPECT_EQ(e.GetMessage(), "Could not transform GCPs to WGS84 Ellipsoidal");
            EXPECT_EQ(e.GetFile(), "mathmodel/lumo/mmodel_func");
            EXPECT_EQ(e.GetLine(), 217);
        }
        ExpectUnchanged(asGcps, asIn);
        std::vector<ControlPoint_t> asEmpty;
        EXPECT_THROW(ConvertGcpsToWgs84Ell(sLonLat, "M", asEmpty), nova::Exception);
        EXPECT_TRUE(asEmpty.empty());
        // Ellipsoidal heights need no geoid model.
        EXPECT_NO_THROW(ConvertGcpsToWgs84Ell(sLonLat, "E", asGcps));
    });
    if (!bRan) GTEST_SKIP() << "no PROJ database";
}

// ---------------------------------------------------------------------------
// The tool: lumo gcps convert
// ---------------------------------------------------------------------------

using lumo::support::RunResult;
using lumo::support::RunTool;

class GcpsConvertCommand : public lumo::support::ScratchDirTest {
  protected:
    GcpsConvertCommand() : ScratchDirTest("lumo_gcps_") {}
};

TEST_F(GcpsConvertCommand, ConvertsTheBundledControlPoints) {
    const std::string osInput = std::string(LUMO_SOURCE_DIR) + "/examples/poly_utm31_gcps.csv";
    const std::string osOutput = Path("out.csv");
    const RunResult sRun = RunTool({"gcps", "convert", "--geosys", "UTM 31 U D000", "--height-ref",
                                    "M", osInput, "-o", osOutput});
    ASSERT_EQ(sRun.nCode, 0) << sRun.osErr;
    const lumo::cli::PointSet sIn =
        lumo::cli::ReadPointsFile(osInput, lumo::cli::PointKind::ControlPoint);
    const lumo::cli::PointSet sOut =
        lumo::cli::ReadPointsFile(osOutput, lumo::cli::PointKind::ControlPoint);

    // The library's conversion of the same points, written without loss.
    std::vector<ControlPoint_t> asExpected;
    for (const auto& p : sIn.asPoints)
        asExpected.push_back({p.dfPixel, p.dfLine, p.dfX, p.dfY, p.dfZ});
    ConvertGcpsToWgs84Ell(Projection("UTM 31 U D000"), "M", asExpected);
    ASSERT_EQ(sOut.asPoints.size(), asExpected.size());
    ASSERT_TRUE(sOut.bHasId && sOut.bHasZ);
    for (std::size_t i = 0; i < asExpected.size(); ++i) {
        EXPECT_EQ(sOut.asPoints[i].osId, sIn.asPoints[i].osId);
        EXPECT_EQ(sOut.asPoints[i].dfLine, sIn.asPoints[i].dfLine);
        EXPECT_EQ(sOut.asPoints[i].dfX, asExpected[i].dfGroundX);
        EXPECT_EQ(sOut.asPoints[i].dfY, asExpected[i].dfGroundY);
        EXPECT_EQ(sOut.asPoints[i].dfZ, asExpected[i].dfGroundZ);
    }
}

TEST_F(GcpsConvertCommand, ErrorsNameTheBadValue) {
    const std::string osInput =
        Write("in.csv", "id,pixel,line,x,y,z\nA,1,2,5,52,0\nB,3,4,5,95,0\n");
    const std::string osOutput = Write("kept.csv", "old contents\n");
    const std::string osNoZ = Write("noz.csv", "id,pixel,line,x,y\nA,1,2,5,52\n");

    const struct {
        std::vector<std::string> asArgs;
        std::string osMessagePart;
    } asCases[] = {
        {{"--geosys", "NOT A PROJECTION", "--height-ref", "E", osInput}, "\"NOT A PROJECTION\""},
        {{"--geosys", "PIXEL", "--height-ref", "E", osInput}, "\"PIXEL\""},
        {{"--geosys", "LONG/LAT D000", "--height-ref", "X", osInput}, "X"},
        {{"--geosys", "LONG/LAT D000", "--height-ref", "M", osInput}, ":3 (id \"B\")"},
        {{"--geosys", "LONG/LAT D000", "--height-ref", "E", Path("missing.csv")}, "missing"},
        {{"--height-ref", "E", osInput}, "--geosys"},
        {{"--geosys", "LONG/LAT D000", "--height-ref", "E", osNoZ}, "no z column"},
    };
    for (const auto& sCase : asCases) {
        std::vector<std::string> asArgs = {"gcps", "convert"};
        asArgs.insert(asArgs.end(), sCase.asArgs.begin(), sCase.asArgs.end());
        asArgs.insert(asArgs.end(), {"-o", osOutput});
        const RunResult sRun = RunTool(asArgs);
        EXPECT_NE(sRun.nCode, 0) << sCase.osMessagePart;
        EXPECT_NE(sRun.osErr.find(sCase.osMessagePart), std::string::npos) << sRun.osErr;
        EXPECT_EQ(lumo::support::ReadText(osOutput), "old contents\n") << sCase.osMessagePart;
    }
}

}  // namespace
