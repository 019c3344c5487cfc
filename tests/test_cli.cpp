// Tests of the lumo tool: model and point files, the demonstration and the
// point-transform commands run end to end through RunLumo.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
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

namespace fs = std::filesystem;
using lumo::cli::PointKind;
using nlohmann::json;

namespace {

const std::string kExamples = std::string(LUMO_SOURCE_DIR) + "/examples";
const std::string kModel = kExamples + "/poly_utm31.json";
const std::string kGcps = kExamples + "/poly_utm31_gcps.csv";

using lumo::support::ReadText;
using lumo::support::RunResult;
using lumo::support::RunTool;

class CliTest : public lumo::support::ScratchDirTest {
  protected:
    CliTest() : ScratchDirTest("lumo_cli_") {}
};

// The message of the nova::DataException that `action` throws.
std::string FailureOf(const std::function<void()>& action) {
    try {
        action();
    } catch (const nova::DataException& e) {
        return e.what();
    }
    ADD_FAILURE() << "no exception thrown";
    return "";
}

bool SameBits(double a, double b) {
    std::uint64_t bitsA = 0;
    std::uint64_t bitsB = 0;
    std::memcpy(&bitsA, &a, sizeof a);
    std::memcpy(&bitsB, &b, sizeof b);
    return bitsA == bitsB;
}

lumo::cli::PointSet ParsePoints(const std::string& text, PointKind kind) {
    std::istringstream in(text);
    return lumo::cli::ReadPoints(in, "pts.csv", kind);
}

}  // namespace

TEST_F(CliTest, PolyModelWriteReadIsBitExact) {
    lumo::cli::PolyPtr poly(POLYAllocate());
    poly->nCoeffs = 21;
    poly->nPixels = 6000;
    poly->nLines = 4321;
    const double awkward[] = {
        1.0 / 3.0,           -0.1,  5e-324, 1.7976931348623157e308, -0.0, 2.2250738585072014e-308,
        123456789.123456789, -7e-19};
    for (int k = 0; k < 21; ++k) {
        poly->padfPixelCoeffs[k] = awkward[k % 8] / (k + 1);
        poly->padfLineCoeffs[k] = std::nextafter(awkward[(k + 3) % 8], 1.0);
        poly->padfXCoeffs[k] = std::sin(k + 0.5) * std::pow(10.0, k - 10);
        poly->padfYCoeffs[k] = -std::cos(k * 1.7) / 3.0;
    }
    std::strcpy(poly->pszGeosys, "UTM 31 U D000");
    ASSERT_EQ(Geosys2ProjInfo(poly->psProjInfo, poly->pszGeosys, 0.0, 0.0, 1.0, 1.0), 0);

    const std::string path = (mDir / "model.json").string();
    lumo::cli::WriteModelFile(path, lumo::cli::PolyToJson(*poly));
    const lumo::cli::PolyPtr back = lumo::cli::ReadPolyModelFile(path);
    EXPECT_EQ(back->nCoeffs, 21);
    EXPECT_EQ(back->nPixels, 6000);
    EXPECT_EQ(back->nLines, 4321);
    EXPECT_STREQ(back->pszGeosys, "UTM 31 U D000");
    EXPECT_EQ(back->psProjInfo->nZone, poly->psProjInfo->nZone);
    for (int k = 0; k < 21; ++k) {
        EXPECT_TRUE(SameBits(back->padfPixelCoeffs[k], poly->padfPixelCoeffs[k])) << k;
        EXPECT_TRUE(SameBits(back->padfLineCoeffs[k], poly->padfLineCoeffs[k])) << k;
        EXPECT_TRUE(SameBits(back->padfXCoeffs[k], poly->padfXCoeffs[k])) << k;
        EXPECT_TRUE(SameBits(back->padfYCoeffs[k], poly->padfYCoeffs[k])) << k;
    }
    // The generic reader gives the same record behind model code 4.
    const lumo::cli::LoadedModel loaded = lumo::cli::ReadModelFile(path);
    EXPECT_EQ(loaded.nModelCode, LUMO_CODE_POLY);
    ASSERT_NE(loaded.AsPoly(), nullptr);
    EXPECT_TRUE(SameBits(loaded.AsPoly()->padfYCoeffs[20], poly->padfYCoeffs[20]));
    EXPECT_FALSE(lumo::cli::PolyToJson(*poly).contains("projParms"));  // UTM needs none

    // A coefficient that JSON cannot hold is refused rather than written as null.
    poly->padfXCoeffs[4] = std::numeric_limits<double>::quiet_NaN();
    EXPECT_NE(FailureOf([&] { lumo::cli::PolyToJson(*poly); }).find("xCoeffs"), std::string::npos);
}

TEST_F(CliTest, ProjectionParametersTravelWithTheModel) {
    lumo::cli::PolyPtr poly(POLYAllocate());
    poly->nCoeffs = 3;
    std::strcpy(poly->pszGeosys, "TM E008");
    ASSERT_EQ(Geosys2ProjInfo(poly->psProjInfo, poly->pszGeosys, 0.0, 0.0, 1.0, 1.0), 0);
    ASSERT_TRUE(RequiresProjInfo(DecodeGeosys(poly->pszGeosys, nullptr)));
    poly->psProjInfo->adfProjParms[2] = 0.9996;
    poly->psProjInfo->adfProjParms[4] = 9.0;
    poly->psProjInfo->adfProjParms[6] = 500000.0;
    const json document = lumo::cli::PolyToJson(*poly);
    ASSERT_TRUE(document.contains("projParms"));
    const std::string path = Write("tm.json", document.dump());
    const lumo::cli::PolyPtr back = lumo::cli::ReadPolyModelFile(path);
    for (int i = 0; i < NOVA_PROJ_PARMS; ++i) {
        EXPECT_EQ(back->psProjInfo->adfProjParms[i], poly->psProjInfo->adfProjParms[i]) << i;
    }
}

TEST_F(CliTest, ModelFileErrorsNameFileAndField) {
    const json good = lumo::cli::ParseJsonFile(kModel);
    struct Case {
        std::function<void(json&)> mutate;
        std::string expected;  // part of the message besides the file name
    };
    // One case per kind of fault; the field helpers' wordings are tested
    // with the helpers.
    const std::vector<Case> cases = {
        {[](json& d) { d.erase("geosys"); }, "\"geosys\" is missing"},
        {[](json& d) { d["version"] = 2; }, "\"version\" must lie in 1..1"},
        {[](json& d) { d["family"] = "nope"; }, "unknown model family \"nope\""},
        {[](json& d) { d["poly"]["nCoeffs"] = 22; }, "\"poly.nCoeffs\" must lie in 1..21"},
        {[](json& d) { d["poly"]["pixelCoeffs"].erase(0); },
         "\"poly.pixelCoeffs\" must hold 10 numbers (nCoeffs), found 9"},
        {[](json& d) { d["poly"]["yCoeffs"][3] = "x"; }, "\"poly.yCoeffs\" item 3 must be"},
        {[](json& d) { d["geosys"] = "UTM 31 U D000 EXTRA"; }, "longer than 16"},
        {[](json& d) { d["geosys"] = "NOWHERE 99"; }, "\"NOWHERE 99\" cannot be used"},
    };
    for (std::size_t i = 0; i < cases.size(); ++i) {
        json document = good;
        cases[i].mutate(document);
        const std::string path = Write("case" + std::to_string(i) + ".json", document.dump());
        const std::string message = FailureOf([&] { lumo::cli::ReadModelFile(path); });
        EXPECT_NE(message.find(path), std::string::npos) << message;
        EXPECT_NE(message.find(cases[i].expected), std::string::npos) << i << ": " << message;
    }
    const std::string badJson = Write("bad.json", "{\"format\": \"lumo-model\",");
    EXPECT_NE(FailureOf([&] { lumo::cli::ReadModelFile(badJson); }).find("not valid JSON"),
              std::string::npos);
    const std::string missing = (mDir / "absent.json").string();
    EXPECT_NE(FailureOf([&] { lumo::cli::ReadModelFile(missing); }).find(missing),
              std::string::npos);
    const std::string array = Write("array.json", "[1, 2]");
    EXPECT_NE(FailureOf([&] { lumo::cli::ReadModelFile(array); }).find("JSON object"),
              std::string::npos);
}

TEST_F(CliTest, PointFilesParse) {
    const auto set = ParsePoints(
        "# sample\r\n ID , Pixel,LINE,extra, Z \r\n\r\nA1, 10.5,-2e3,text,7\n  # "
        "note\nB2,+1,0.1,,0\n",
        PointKind::Image);
    ASSERT_EQ(set.asPoints.size(), 2u);
    EXPECT_TRUE(set.bHasId);
    EXPECT_TRUE(set.bHasZ);
    EXPECT_EQ(set.asPoints[0].osId, "A1");
    EXPECT_EQ(set.asPoints[0].dfPixel, 10.5);
    EXPECT_EQ(set.asPoints[0].dfLine, -2000.0);
    EXPECT_EQ(set.asPoints[0].dfZ, 7.0);
    EXPECT_EQ(set.asPoints[0].nSourceLine, 4);
    EXPECT_EQ(set.asPoints[1].dfPixel, 1.0);
    EXPECT_EQ(set.asPoints[1].dfLine, 0.1);
    EXPECT_EQ(set.asPoints[1].nSourceLine, 6);

    const auto ground = ParsePoints("x,y\n1,2\n", PointKind::Ground);
    EXPECT_FALSE(ground.bHasId);
    EXPECT_FALSE(ground.bHasZ);
    EXPECT_EQ(ground.asPoints.at(0).dfZ, 0.0);
    EXPECT_TRUE(ParsePoints("x,y\n", PointKind::Ground).asPoints.empty());

    // Written numbers read back to the same doubles.
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
    using C = lumo::cli::PointColumn;
    lumo::cli::WritePoints(text, many, {C::Id, C::Pixel, C::Line, C::X, C::Y, C::Z});
    const auto back = ParsePoints(text.str(), PointKind::ControlPoint);
    ASSERT_EQ(back.asPoints.size(), many.asPoints.size());
    for (std::size_t i = 0; i < many.asPoints.size(); ++i) {
        const auto& a = many.asPoints[i];
        const auto& b = back.asPoints[i];
        EXPECT_EQ(a.osId, b.osId);
        EXPECT_TRUE(SameBits(a.dfPixel, b.dfPixel) && SameBits(a.dfLine, b.dfLine) &&
                    SameBits(a.dfX, b.dfX) && SameBits(a.dfY, b.dfY) && SameBits(a.dfZ, b.dfZ))
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
        const std::string message = FailureOf([&] { ParsePoints(c.text, c.kind); });
        EXPECT_NE(message.find(c.expected), std::string::npos) << c.text << " -> " << message;
    }
    const std::string missing = (mDir / "absent.csv").string();
    EXPECT_NE(FailureOf([&] {
                  lumo::cli::ReadPointsFile(missing, PointKind::Ground);
              }).find(missing + ": cannot open"),
              std::string::npos);
}

TEST_F(CliTest, DemoRoundTripsAreSmall) {
    ASSERT_FALSE(lumo::cli::FamilyDemos().empty());
    for (const auto& demo : lumo::cli::FamilyDemos()) {
        // The rigorous, radar and orbit rows measure fitted models against
        // simulated truth: their bounds are those of test_srit_cli,
        // test_rtcs_cli and test_lrs_cli.
        const std::string family = demo.pszFamily;
        if (family == "srit" || family == "rtcs" || family == "lrs") continue;
        const auto r = lumo::cli::RunFamilyDemo(demo, kExamples);
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
    const RunResult run = RunTool({"demo"});
    EXPECT_EQ(run.nCode, 0) << run.osErr;
    EXPECT_NE(run.osOut.find("poly_utm31.json"), std::string::npos);

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
    const RunResult toImage = RunTool({"poly", kModel, "--to-image", kGcps, "-o", imageOut});
    ASSERT_EQ(toImage.nCode, 0) << toImage.osErr;
    EXPECT_TRUE(toImage.osOut.empty());
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

    const RunResult toGround = RunTool({"poly", kModel, "--to-ground", kGcps});
    ASSERT_EQ(toGround.nCode, 0) << toGround.osErr;
    EXPECT_EQ(ParsePoints(toGround.osOut, PointKind::ControlPoint).asPoints.size(),
              gcps.asPoints.size());
    // The generic command dispatches the same model to the same numbers.
    const RunResult generic = RunTool({"transform", kModel, "--to-ground", kGcps});
    EXPECT_EQ(generic.nCode, 0);
    EXPECT_EQ(generic.osOut, toGround.osOut);

    const RunResult version = RunTool({"--version"});
    EXPECT_EQ(version.nCode, 0);
    EXPECT_EQ(version.osOut.rfind(std::string("lumo ") + LumoVersion(), 0), 0u) << version.osOut;
}

TEST_F(CliTest, CommandFailuresAreReportedAndKeepOutput) {
    const std::string out = Write("out.csv", "precious\n");
    const std::string badPoints = Write("bad.csv", "id,x,y\nA,1,2\nB,3,oops\n");
    const std::string farPoints = Write("far.csv", "id,x,y\nFar,1e300,1e300\n");
    const std::string tps = Write("tps.json", R"({"format":"lumo-model","version":1,
        "family":"tps","geosys":"UTM 31 U D000","pixels":1,"lines":1,"tps":{}})");
    const struct {
        std::vector<std::string> args;
        std::string expected;
    } cases[] = {
        {{"poly", kModel, "--to-image", badPoints, "-o", out}, badPoints + ":3: column 3"},
        {{"poly", kModel, "--to-image", farPoints, "-o", out},
         "(id \"Far\"): (1e+300, 1e+300) has"},
        {{"poly", (mDir / "none.json").string(), "--to-image", kGcps, "-o", out}, "none.json"},
        {{"poly", tps, "--to-image", kGcps, "-o", out}, "not a polynomial model"},
        {{"transform", tps, "--to-image", kGcps, "-o", out}, "field \"tps.geoToImage\" is missing"},
        {{"poly", kModel, "--to-image", kGcps, "--to-ground", kGcps}, "excludes"},
        {{"poly", kModel}, "--to-image POINTS or --to-ground POINTS"},
        {{"transform"}, "model is required"},
        {{"bogus"}, "bogus"},
    };
    for (const auto& c : cases) {
        const RunResult r = RunTool(c.args);
        EXPECT_NE(r.nCode, 0) << c.args[0];
        EXPECT_NE(r.osErr.find(c.expected), std::string::npos) << r.osErr;
        EXPECT_EQ(ReadText(out), "precious\n");
        EXPECT_FALSE(fs::exists(out + ".tmp"));
    }
}
