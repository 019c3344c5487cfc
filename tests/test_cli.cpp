// Tests of the lumo tool: model and point files, the demonstration and the
// point-transform commands run end to end through RunLumo.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <sstream>
#include <string>
#include <vector>

#include "cli.h"
#include "demo.h"
#include "model_io.h"
#include "nova/projection.h"
#include "nova/runtime.h"
#include "points_io.h"
#include "support/cli_runner.h"
#include "support/numbered_error.h"

using lumo::cli::PointKind;
using nlohmann::json;

namespace {

const std::string kExamples = std::string(LUMO_SOURCE_DIR) + "/examples";
const std::string kModel = kExamples + "/poly_utm31.json";
const std::string kGcps = kExamples + "/poly_utm31_gcps.csv";

using lumo::support::DataErrorOf;
using lumo::support::ReadText;
using lumo::support::RunOk;
using lumo::support::RunResult;
using lumo::support::RunTool;

using CliTest = lumo::support::ScratchDirTest;

lumo::cli::PointSet ParsePoints(const std::string& text, PointKind kind) {
    std::istringstream in(text);
    return lumo::cli::ReadPoints(in, "pts.csv", kind);
}

}  // namespace

TEST_F(CliTest, PolyModelFileRoundTripIsBitExact) {
    // A transverse Mercator needs its projection parameters in the file.
    lumo::cli::PolyPtr poly(POLYAllocate());
    poly->nCoeffs = 21;
    poly->nPixels = 6000;
    poly->nLines = 4321;
    std::strcpy(poly->pszGeosys, "TM E008");
    ASSERT_EQ(Geosys2ProjInfo(poly->psProjInfo, poly->pszGeosys, 0.0, 0.0, 1.0, 1.0), 0);
    poly->psProjInfo->adfProjParms[2] = 0.9996;
    poly->psProjInfo->adfProjParms[4] = 9.0;
    poly->psProjInfo->adfProjParms[6] = 500000.0;
    const double awkward[] = {
        1.0 / 3.0,           -0.1,  5e-324, 1.7976931348623157e308, -0.0, 2.2250738585072014e-308,
        123456789.123456789, -7e-19};
    for (int k = 0; k < 21; ++k) {
        poly->padfPixelCoeffs[k] = awkward[k % 8] / (k + 1);
        poly->padfLineCoeffs[k] = std::nextafter(awkward[(k + 3) % 8], 1.0);
        poly->padfXCoeffs[k] = std::sin(k + 0.5) * std::pow(10.0, k - 10);
        poly->padfYCoeffs[k] = -std::cos(k * 1.7) / 3.0;
    }
    // The writer's numbers read back to the same bits (its text is the
    // shortest that does), so the document written again is the same text;
    // the generic reader gives the same record behind model code 4.
    const json document = lumo::cli::PolyToJson(*poly);
    ASSERT_TRUE(document.contains("projParms"));
    const std::string path = (mDir / "model.json").string();
    lumo::cli::WriteModelFile(path, document);
    EXPECT_EQ(lumo::cli::PolyToJson(*lumo::cli::ReadPolyModelFile(path)).dump(), document.dump());
    const lumo::cli::LoadedModel loaded = lumo::cli::ReadModelFile(path);
    EXPECT_EQ(loaded.nModelCode, LUMO_CODE_POLY);
    ASSERT_NE(loaded.AsPoly(), nullptr);
    EXPECT_EQ(lumo::cli::PolyToJson(*loaded.AsPoly()).dump(), document.dump());

    // A coefficient that JSON cannot hold is refused rather than written as null.
    poly->padfXCoeffs[4] = std::numeric_limits<double>::quiet_NaN();
    EXPECT_NE(DataErrorOf([&] { lumo::cli::PolyToJson(*poly); }).find("xCoeffs"),
              std::string::npos);
}

TEST_F(CliTest, PointFilesParse) {
    // Names in any case with blanks around, extra columns, comments, blank
    // lines and CR LF line ends; a sign before a number.
    const auto set = ParsePoints(
        "# sample\r\n ID , Pixel,LINE,extra, Z \r\n\r\nA1, 10.5,-2e3,text,7\n  # "
        "note\nB2,+1,0.1,,0\n",
        PointKind::Image);
    using C = lumo::cli::PointColumn;
    std::ostringstream written;
    lumo::cli::WritePoints(written, set, {C::Id, C::Pixel, C::Line, C::Z});
    EXPECT_EQ(written.str(), "id,pixel,line,z\nA1,10.5,-2000,7\nB2,1,0.1,0\n");
    EXPECT_TRUE(set.bHasId && set.bHasZ);
    EXPECT_EQ(set.asPoints.at(0).nSourceLine, 4);
    EXPECT_EQ(set.asPoints.at(1).nSourceLine, 6);
    const auto ground = ParsePoints("x,y\n1,2\n", PointKind::Ground);
    EXPECT_FALSE(ground.bHasId || ground.bHasZ);
    EXPECT_EQ(ground.asPoints.at(0).dfZ, 0.0);
    EXPECT_TRUE(ParsePoints("x,y\n", PointKind::Ground).asPoints.empty());

    // Written numbers read back to the same doubles (all finite and non-zero
    // but one, so == compares their bits).
    lumo::cli::PointSet many;
    for (int i = 0; i < 200; ++i) {
        lumo::cli::PointRecord p;
        p.osId = "p" + std::to_string(i);
        p.dfPixel = std::exp(i * 0.37 - 30.0);
        p.dfLine = -1.0 / (i + 3);
        p.dfX = 4.4e5 + i / 7.0;
        p.dfY = std::nextafter(5.7e6, 0.0) - i;
        p.dfZ = i * 0.1;
        many.asPoints.push_back(p);
    }
    many.bHasId = many.bHasZ = true;
    std::ostringstream text;
    lumo::cli::WritePoints(text, many, {C::Id, C::Pixel, C::Line, C::X, C::Y, C::Z});
    const auto back = ParsePoints(text.str(), PointKind::ControlPoint);
    ASSERT_EQ(back.asPoints.size(), many.asPoints.size());
    for (std::size_t i = 0; i < many.asPoints.size(); ++i) {
        const auto& a = many.asPoints[i];
        const auto& b = back.asPoints[i];
        EXPECT_TRUE(a.osId == b.osId && a.dfPixel == b.dfPixel && a.dfLine == b.dfLine &&
                    a.dfX == b.dfX && a.dfY == b.dfY && a.dfZ == b.dfZ)
            << i;
    }
}

TEST_F(CliTest, PointFileErrorsNamePlace) {
    const struct {
        std::string text;
        PointKind kind;
        std::string expected;
    } cases[] = {
        {"# only a comment\n\n", PointKind::Ground, "pts.csv: empty file"},
        {"id,x\n", PointKind::Ground, "pts.csv:1: missing column \"y\" (header has: id, x)"},
        {"pixel,line,x\n", PointKind::ControlPoint, "missing column \"y\""},
        {"x,y,X\n", PointKind::Ground, "column \"x\" appears twice"},
        {"x,y\n1,2\n\n1.5e,2\n", PointKind::Ground, "pts.csv:4: column 1 (\"x\"): \"1.5e\""},
        {"x,y\n1,\n", PointKind::Ground, "column 2 (\"y\"): \"\" is not"},
        {"x,y\nnan,1\n", PointKind::Ground, "\"nan\" is not a finite number"},
        {"x,y\n1,1e999\n", PointKind::Ground, "\"1e999\" is not a finite number"},
        {"id,x,y\nA,1\n", PointKind::Ground, "expected 3 fields as in the header, found 2"},
    };
    for (const auto& c : cases) {
        const std::string message = DataErrorOf([&] { ParsePoints(c.text, c.kind); });
        EXPECT_NE(message.find(c.expected), std::string::npos) << c.text << " -> " << message;
    }
}

TEST_F(CliTest, DemoRoundTripsAreSmall) {
    // The rigorous, radar and orbit rows fit their models to control points
    // of simulated scenes: residuals of a fit, and round trips through an
    // iterative inverse.
    struct SimulatedRow {
        std::string family;
        std::size_t nGcps;
        double dfImageRms, dfRoundTrip;
    };
    const std::vector<SimulatedRow> simulated = {
        {"srit", 30, 0.5, 1e-6}, {"rtcs", 40, 0.5, 1e-6}, {"lrs", 100, 0.01, 0.01}};
    std::size_t nSimulatedRows = 0;
    ASSERT_FALSE(lumo::cli::FamilyDemos().empty());
    for (const auto& demo : lumo::cli::FamilyDemos()) {
        const auto r = lumo::cli::RunFamilyDemo(demo, kExamples);
        const auto row =
            std::find_if(simulated.begin(), simulated.end(),
                         [&](const SimulatedRow& s) { return s.family == demo.pszFamily; });
        if (row != simulated.end()) {
            ++nSimulatedRows;
            EXPECT_EQ(r.nGcps, row->nGcps) << row->family;
            EXPECT_LT(r.sImageResidual.Rms(), row->dfImageRms) << row->family;
            EXPECT_LE(r.sImageRoundTrip.dfMax, row->dfRoundTrip) << row->family;
            continue;
        }
        EXPECT_GE(r.nGcps, 10u) << demo.pszFamily;
        EXPECT_EQ(r.sImageRoundTrip.nCount, r.nGcps + 81);
        // The sample GCPs carry ground positions to the millimetre.
        EXPECT_LT(r.sImageResidual.dfMax, 1e-3) << demo.pszFamily;
        EXPECT_LT(r.sGroundResidual.dfMax, 2e-3) << demo.pszFamily;
        EXPECT_LT(r.sGroundRoundTrip.dfMax, 5e-3) << demo.pszFamily;
        EXPECT_LT(r.sImageRoundTrip.dfMax, 1e-3) << demo.pszFamily;
        EXPECT_LE(r.sImageRoundTrip.Rms(), r.sImageRoundTrip.dfMax);
        EXPECT_GT(r.sGroundResidual.dfMax, 0.0);  // the statistics saw real values
    }
    EXPECT_EQ(nSimulatedRows, simulated.size());
    EXPECT_NE(RunOk({"demo"}).osOut.find("poly_utm31.json"), std::string::npos);

    // The examples directory is found through the environment first.
    ASSERT_EQ(setenv("LUMO_EXAMPLES_DIR", mDir.c_str(), 1), 0);
    EXPECT_EQ(lumo::cli::FindExamplesDir(), mDir.string());
    const RunResult empty = RunTool({"demo"});
    EXPECT_NE(empty.nCode, 0);
    EXPECT_NE(empty.osErr.find("poly_utm31.json"), std::string::npos) << empty.osErr;
    ASSERT_EQ(setenv("LUMO_EXAMPLES_DIR", (mDir / "absent").c_str(), 1), 0);
    EXPECT_EQ(lumo::cli::FindExamplesDir(), std::string(LUMO_SOURCE_DIR) + "/examples");
    unsetenv("LUMO_EXAMPLES_DIR");
}

TEST_F(CliTest, PolyCommandMapsSampleControlPoints) {
    const auto gcps = lumo::cli::ReadPointsFile(kGcps, PointKind::ControlPoint);
    const std::string imageOut = (mDir / "image.csv").string();
    EXPECT_EQ(RunOk({"poly", kModel, "--to-image", kGcps, "-o", imageOut}).osOut, "");
    EXPECT_EQ(ReadText(imageOut).rfind("# geosys: UTM 31 U D000\nid,x,y,z,pixel,line,status\nG", 0),
              0u);
    const auto image = lumo::cli::ReadPointsFile(imageOut, PointKind::ControlPoint);
    ASSERT_EQ(image.asPoints.size(), gcps.asPoints.size());
    for (std::size_t i = 0; i < gcps.asPoints.size(); ++i) {
        EXPECT_EQ(image.asPoints[i].osId, gcps.asPoints[i].osId);
        EXPECT_EQ(image.asPoints[i].dfX, gcps.asPoints[i].dfX);
        EXPECT_NEAR(image.asPoints[i].dfPixel, gcps.asPoints[i].dfPixel, 1e-3);
        EXPECT_NEAR(image.asPoints[i].dfLine, gcps.asPoints[i].dfLine, 1e-3);
    }

    const RunResult toGround = RunOk({"poly", kModel, "--to-ground", kGcps});
    EXPECT_EQ(ParsePoints(toGround.osOut, PointKind::ControlPoint).asPoints.size(),
              gcps.asPoints.size());
    // The generic command dispatches the same model to the same numbers.
    EXPECT_EQ(RunOk({"transform", kModel, "--to-ground", kGcps}).osOut, toGround.osOut);

    const std::string version = RunOk({"--version"}).osOut;
    EXPECT_EQ(version.rfind(std::string("lumo ") + LumoVersion(), 0), 0u) << version;
}

// Progress of long work: nothing when standard error is not a terminal (as
// under the test runner), shown when asked for with LUMO_PROGRESS=always.
TEST_F(CliTest, ProgressIsQuietUnlessATerminalOrAskedFor) {
    const auto stderrOfFitAndTransform = [this] {
        testing::internal::CaptureStderr();
        RunOk({"fit", "--model", "tps", "--gcps", kGcps, "--geosys", "UTM 31 U D000", "-o",
               Path("t.json")});
        RunOk({"transform", Path("t.json"), "--to-image", kGcps});
        return testing::internal::GetCapturedStderr();
    };
    EXPECT_EQ(stderrOfFitAndTransform(), "");
    setenv("LUMO_PROGRESS", "always", 1);
    const std::string shown = stderrOfFitAndTransform();
    setenv("LUMO_PROGRESS", "never", 1);
    EXPECT_EQ(stderrOfFitAndTransform(), "");
    unsetenv("LUMO_PROGRESS");
    EXPECT_NE(shown.find("\rlumo fit: fitting the thin plate spline to 15 control points... 0 s"),
              std::string::npos)
        << shown;
    EXPECT_NE(shown.find("\rtransforming 100%"), std::string::npos) << shown;
}
