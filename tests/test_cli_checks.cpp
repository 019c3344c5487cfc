// The tool never reports a wrong answer as success: exit statuses, failed
// points, heights, georeferencing of point files, lowered fit orders and
// block control points that disagree.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <sstream>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "points_io.h"
#include "support/cli_runner.h"

namespace {

using lumo::support::ReadText;
using lumo::support::RunResult;
using lumo::support::RunTool;

const std::string kExamples = std::string(LUMO_SOURCE_DIR) + "/examples/";

class CliChecks : public lumo::support::ScratchDirTest {
  protected:
    CliChecks() : ScratchDirTest("lumo_checks_") {}

    // Runs the tool and checks its exit status and a part of its messages.
    RunResult Expect(const std::vector<std::string>& args, int nCode, const std::string& err) {
        RunResult r = RunTool(args);
        EXPECT_EQ(r.nCode, nCode) << args[0] << ": " << r.osErr;
        EXPECT_NE(r.osErr.find(err), std::string::npos) << r.osErr;
        return r;
    }
};

TEST_F(CliChecks, UsageErrorsAndFailuresHaveTheirStatus) {
    Expect({"bogus"}, 2, "bogus");
    Expect({"transform"}, 2, "model is required");
    Expect({"fit", "--model", "poly", "--order", "9", "--gcps", "g.csv", "-o", "m.json"}, 2,
           "--order");
    Expect({"transform", kExamples + "none.json", "--to-image", "p.csv"}, 1, "none.json");
    EXPECT_EQ(RunTool({"transform", "--help"}).nCode, 0);
}

TEST_F(CliChecks, FailedPointsAreNeverPositions) {
    // The camera sees (0, 0, 0) nowhere: the point fails, the others are kept.
    const std::string pts = Write("g.csv", "id,x,y,z\nFar,0,0,0\nNear,452013,5702987,80\n");
    const std::string out = Path("out.csv");
    const std::string ap = kExamples + "ap_frame_utm31.json";
    Expect({"transform", ap, "--to-image", pts, "-o", out}, 3, "1 of 2 points failed");
    const std::string text = ReadText(out);
    EXPECT_NE(text.find("\nFar,0,0,0,,,failed-to-image\n"), std::string::npos) << text;
    EXPECT_NE(text.find("\nNear,452013,5702987,80,"), std::string::npos);
    EXPECT_EQ(text.find("e+20"), std::string::npos);
    Expect({"transform", ap, "--to-image", pts, "--keep-going"}, 0, "(id \"Far\")");
    // The residuals of that point are empty, and the RMS figures leave it out.
    const std::string gcps = Write("c.csv", "id,pixel,line,x,y,z\nFar,1,1,0,0,0\n");
    const RunResult r = Expect({"residuals", ap, "--gcps", gcps}, 3, "failed-to-image");
    EXPECT_NE(r.osOut.find("Far,1,1,0,0,0,,,"), std::string::npos) << r.osOut;
    // A height far outside the rational functions' domain has no ground point.
    const std::string image = Write("i.csv", "id,pixel,line,z\nB,100,100,1e9\n");
    const RunResult rf = Expect({"transform", kExamples + "rf_scene.json", "--to-ground", image}, 3,
                                "(id \"B\"): failed-to-ground");
    EXPECT_NE(rf.osOut.find("\nB,100,100,1e+09,,,failed-to-ground\n"), std::string::npos);
}

TEST_F(CliChecks, RecordsThatCannotBeEvaluatedAreRefused) {
    nlohmann::json segment =
        nlohmann::json::parse(ReadText(kExamples + "segment_optical_attitude.json"));
    segment["nNumLines"] = -1;
    Expect({"segment", Write("s.json", segment.dump())}, 1, "nNumLines = -1");
    // A binary block whose scale reads 0 does not become a model file.
    Expect({"rpc", kExamples + "rf_scene_RPC.TXT", Path("b.bin")}, 0, "");
    std::string block = ReadText(Path("b.bin"));
    block.replace(536 + 22 * 9, 22, "  0.00000000000000e+00");  // dfLineScale
    Expect({"rpc", Write("zero.bin", block), Path("m.json")}, 1, "dfLineScale = 0");
    EXPECT_FALSE(std::filesystem::exists(Path("m.json")));
}

TEST_F(CliChecks, HeightsAreGivenNotAssumed) {
    const std::string rf = kExamples + "rf_scene.json";
    const std::string pts = Write("i.csv", "pixel,line\n5000,5000\n");
    Expect({"transform", rf, "--to-ground", pts}, 1, "no z column");
    Expect({"residuals", rf, "--gcps", kExamples + "rf_scene_gcps.csv", "--height", "5"}, 1,
           "has a z column");
    const RunResult r = Expect({"transform", rf, "--to-ground", pts, "--height", "100"}, 0, "");
    EXPECT_NE(r.osOut.find("pixel,line,z,x,y,status\n5000,5000,100,"), std::string::npos);
    // Polynomials do not depend on the height: no z is needed there.
    Expect({"transform", kExamples + "poly_utm31.json", "--to-ground", pts}, 0, "");
}

TEST_F(CliChecks, GroundCoordinatesAreConvertedOrRefused) {
    const std::string poly = kExamples + "poly_utm31.json";
    const std::string gcps = kExamples + "poly_utm31_gcps.csv";
    // UTM control points against a longitude/latitude model.
    Expect({"residuals", kExamples + "rf_scene.json", "--gcps", gcps}, 1, "is not a latitude");
    // The same points in WGS 84 degrees (converted by the control point
    // conversion) map to the same image positions once declared.
    Expect({"gcps", "convert", "--geosys", "UTM 31 U D000", "--height-ref", "E", gcps, "-o",
            Path("ll.csv")},
           0, "");
    const RunResult utm = Expect({"transform", poly, "--to-image", gcps}, 0, "");
    const RunResult ll = Expect({"transform", poly, "--to-image", Path("ll.csv")}, 0, "");
    std::istringstream utmText(utm.osOut), llText(ll.osOut);
    const auto a = lumo::cli::ReadPoints(utmText, "utm", lumo::cli::PointKind::ControlPoint);
    const auto b = lumo::cli::ReadPoints(llText, "ll", lumo::cli::PointKind::ControlPoint);
    EXPECT_EQ(b.osGeosys, "LONG/LAT D000");
    ASSERT_EQ(a.asPoints.size(), b.asPoints.size());
    for (std::size_t i = 0; i < a.asPoints.size(); ++i) {
        EXPECT_NEAR(a.asPoints[i].dfPixel, b.asPoints[i].dfPixel, 1e-6);
        EXPECT_NEAR(a.asPoints[i].dfLine, b.asPoints[i].dfLine, 1e-6);
    }
    Expect({"transform", poly, "--to-image", Path("ll.csv"), "--geosys", "UTM 31 U D000"}, 1,
           "contradicts");
}

TEST_F(CliChecks, FitRefusesALowerOrderUnlessAllowed) {
    const std::string same =
        Write("same.csv", "pixel,line,x,y\n1,1,5,5\n1,1,5,5\n1,1,5,5\n1,1,5,5\n1,1,5,5\n");
    const std::vector<std::string> args = {
        "fit", "--model",  "poly",          "--order", "2",           "--gcps",
        same,  "--geosys", "UTM 31 U D000", "-o",      Path("p.json")};
    Expect(args, 1, "all at one place");
    EXPECT_FALSE(std::filesystem::exists(Path("p.json")));
    std::vector<std::string> allowed = args;
    allowed.push_back("--allow-lower-order");
    Expect(allowed, 0, "writing the lower order");
}

TEST_F(CliChecks, BlockControlPointsMustAgreeAndBePhysical) {
    nlohmann::json project = nlohmann::json::parse(ReadText(kExamples + "block_stereo.json"));
    for (auto& image : project["images"])
        image["segment"] = kExamples + image["segment"].get<std::string>();
    const auto run = [&](const std::function<void(nlohmann::json&)>& change,
                         const std::string& err) {
        nlohmann::json changed = project;
        change(changed);
        Write("p.json", changed.dump());
        Expect({"block", Path("p.json"), "-o", Path("out")}, 1, err);
        EXPECT_FALSE(std::filesystem::exists(Path("out")));
    };
    // gcps[0] and gcps[1] observe G1 in the two images.
    run([](nlohmann::json& p) { p["gcps"][1]["x"] = p["gcps"][0]["x"].get<double>() + 0.5; },
        "gcps[1] gives control point \"G1\" the ground position (482380.007");
    run([](nlohmann::json& p) { p["gcps"][1].erase("z"); }, "but gcps[0] gives");
    run([](nlohmann::json& p) { p["gcps"][0]["x"] = 1e308; }, "gcps[0].x 1e+308 is not a physical");
    run([](nlohmann::json& p) { p["gcps"][0]["sdZ"] = 0; }, "gcps[0].sdZ must be positive");
}

}  // namespace
