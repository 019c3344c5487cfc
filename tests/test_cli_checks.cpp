// The tool never reports a wrong answer as success: every refusal of every
// command has its exit status and message and leaves existing output alone;
// failed points, heights and the georeferencing of point files.
#include <gtest/gtest.h>

#include <filesystem>
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
using nlohmann::json;

const std::string kExamples = std::string(LUMO_SOURCE_DIR) + "/examples/";
const std::string kGcps = kExamples + "poly_utm31_gcps.csv";
constexpr const char* kUtm = "UTM 31 U D000";

class CliChecks : public lumo::support::ScratchDirTest {
  protected:
    // Runs the tool and checks its exit status and a part of its messages.
    RunResult Expect(const std::vector<std::string>& args, int nCode, const std::string& err) {
        RunResult r = RunTool(args);
        EXPECT_EQ(r.nCode, nCode) << args[0] << ": " << r.osErr;
        EXPECT_NE(r.osErr.find(err), std::string::npos) << r.osErr;
        return r;
    }

    // The bundled stereo block project with one change, written to `name`.
    std::string Project(const std::string& name, const std::function<void(json&)>& change) const {
        json project = json::parse(ReadText(kExamples + "block_stereo.json"));
        for (auto& image : project["images"]) {
            image["segment"] = kExamples + image["segment"].get<std::string>();
        }
        change(project);
        return Write(name, project.dump());
    }
};

// One case per refusal: usage errors end with status 2, input that cannot
// be used with 1; the output file keeps what it held and no partial file is
// left beside it.
TEST_F(CliChecks, EveryRefusalHasItsStatusAndKeepsOutput) {
    const std::string out = Write("out.json", "precious\n");
    const std::string rpc = kExamples + "rf_scene_RPC.TXT",
                      rfGcps = kExamples + "rf_scene_gcps.csv";
    const auto fit = [&](const std::string& model, std::vector<std::string> extra,
                         const std::string& gcps = kGcps) {
        std::vector<std::string> args = {"fit", "--model", model, "--gcps", gcps, "-o", out};
        if (model == "rf") {
            args.insert(args.end(), {"--rpc", rpc});
        } else {
            args.insert(args.end(), {"--geosys", kUtm});
        }
        args.insert(args.end(), extra.begin(), extra.end());
        return args;
    };
    const std::string poly = kExamples + "poly_utm31.json";
    const std::string rf = kExamples + "rf_scene.json";
    const std::string badPoints = Write("bad.csv", "id,x,y\nA,1,2\nB,3,oops\n");
    const std::string farPoints = Write("far.csv", "id,x,y\nFar,1e300,1e300\n");
    const std::string tps = Write("tps.json", R"({"format":"lumo-model","version":1,
        "family":"tps","geosys":"UTM 31 U D000","pixels":1,"lines":1,"tps":{}})");
    const std::string empty = Write("empty.csv", "id,pixel,line,x,y\n");
    const std::string noZ = Write("i.csv", "pixel,line\n5000,5000\n");
    const std::string two = Write("two.csv", "pixel,line,x,y,z\n1,2,7.4,46.9,0\n3,4,7.5,47,0\n");
    std::string onePlace = "pixel,line,x,y\n", sameGround = onePlace;
    for (const char* pixel : {"0,0", "10,0", "0,10", "10,10", "5,5"}) {
        onePlace += "1,1,5,5\n";
        sameGround += std::string(pixel) + ",5,5\n";
    }
    // A binary block whose scale reads 0, and RPC text whose latitude offset
    // lies outside the Earth.
    ASSERT_EQ(RunTool({"rpc", rpc, Path("b.bin")}).nCode, 0);
    std::string block = ReadText(Path("b.bin"));
    block.replace(536 + 22 * 9, 22, "  0.00000000000000e+00");  // dfLineScale
    std::string rpcText = ReadText(rpc);
    rpcText.replace(rpcText.find("LAT_OFF: +46.95"), 15, "LAT_OFF: +95.00");
    // In the stereo project gcps[0] and gcps[1] observe G1 at x = 482379.507.
    const std::string moved = Project("p1.json", [](json& p) { p["gcps"][1]["x"] = 482379.51; });
    const std::string noZ1 = Project("p2.json", [](json& p) { p["gcps"][1].erase("z"); });
    const std::string far = Project("p3.json", [](json& p) { p["gcps"][0]["x"] = 1e308; });
    const std::string sdZ = Project("p4.json", [](json& p) { p["gcps"][0]["sdZ"] = 0; });
    const std::string badJson = Write("b.json", "{\"format\": \"lumo-model\",");
    const std::string adj = Path("adj_RPC.TXT");
    const std::string srit = kExamples + "srit_spot5_roll20.json";
    const std::string tie = Project("p5.json", [](json& p) { p["ties"][3]["image"] = "middle"; });
    const std::string seg =
        Write("seg.json", R"({"format":"lumo-segment","version":1,"dfIFOV":[1]})");

    const struct {
        int nCode;
        std::string expected;
        std::vector<std::string> args;
    } cases[] = {
        {2, "bogus", {"bogus"}},
        {2, "model is required", {"transform"}},
        {2, "--to-image POINTS or --to-ground POINTS", {"poly", poly}},
        {2, "excludes", {"poly", poly, "--to-image", kGcps, "--to-ground", kGcps}},
        {1, badPoints + ":3: column 3", {"poly", poly, "--to-image", badPoints, "-o", out}},
        {1, "(1e+300, 1e+300) has no place", {"poly", poly, "--to-image", farPoints, "-o", out}},
        {1, "none.json: cannot open", {"poly", Path("none.json"), "--to-image", kGcps, "-o", out}},
        {1, "not a polynomial model", {"poly", tps, "--to-image", kGcps, "-o", out}},
        {1, "not valid JSON", {"transform", badJson, "--to-image", kGcps, "-o", out}},
        {1, "JSON object", {"transform", Write("a.json", "[1, 2]"), "--to-image", kGcps}},
        {1, "no z column", {"transform", rf, "--to-ground", noZ}},
        {1, "has a z column", {"residuals", rf, "--gcps", rfGcps, "--height", "5"}},
        {1, "is not a latitude", {"residuals", rf, "--gcps", kGcps}},
        {1, "holds no control points", {"residuals", rf, "--gcps", empty}},
        {2, "--gcps", {"residuals", rf}},
        {2, "spline", fit("spline", {})},
        {2, "--order", fit("poly", {"--order", "6"})},
        {2, "--order applies to --model poly only", fit("tps", {"--order", "2"})},
        {2, "--output", {"fit", "--model", "poly", "--gcps", kGcps, "--geosys", kUtm}},
        {1, "\"X\" cannot", {"fit", "--model", "tps", "--geosys", "X", "--gcps", kGcps, "-o", out}},
        {1, "none.csv: cannot open", fit("poly", {}, Path("none.csv"))},
        {1, "holds no control points", fit("poly", {}, empty)},
        {1, "holds binary data",
         fit("poly", {}, Write("zip.csv", std::string("PK\x03\x04\x00\x01", 6)))},
        {1, "determine only order 4", fit("poly", {"--order", "5"})},
        {1, "all at one place", fit("poly", {"--order", "2"}, Write("one.csv", onePlace))},
        {1, "All GCP coordinates are equal. Please check your GCPs.",
         fit("tps", {}, Write("same.csv", sameGround))},
        {2, "--refine \"0\": TOLERANCE", fit("poly", {"--refine", "0"})},
        {2, "--refine \"x\": TOLERANCE", fit("poly", {"--refine", "x"})},
        {2, "--refine \"nan\": TOLERANCE", fit("poly", {"--refine", "nan"})},
        {2, "MIN_POINTS must be a whole number", fit("poly", {"--refine", "3,0"})},
        {1, "MIN_POINTS 2 is below the 3 points", fit("poly", {"--refine", "3,2"})},
        {2, "leave-one-out", fit("tps", {"--refine", "3"})},
        {2, "--adjust apply to --model rf only", fit("poly", {"--adjust", "shift"})},
        {1, "found 2", fit("rf", {}, two)},
        {1, "RPC equivalent", {"fit", "--model", "rf", "--rpc", rpc, "--gcps", rfGcps, "-o", adj}},
        {1, "dfLineScale = 0", {"rpc", Write("zero.bin", block), out}},
        {1, "cannot be evaluated: dfYOffset", {"rpc", Write("bad_RPC.TXT", rpcText), out}},
        {1, "control point \"G1\" the ground position (482379.51,", {"block", moved, "-o", out}},
        {1, "but gcps[0] gives", {"block", noZ1, "-o", out}},
        {1, "gcps[0].x 1e+308 is not a physical", {"block", far, "-o", out}},
        {1, "gcps[0].sdZ must be positive", {"block", sdZ, "-o", out}},
        {1, "ties[3] names image \"middle\"", {"block", tie, "-o", out}},
        {1, "--model srit needs --segment", {"fit", "--model", "srit", "--gcps", kGcps, "-o", out}},
        {2,
         "--closed-form applies to --to-image only",
         {"transform", srit, "--to-ground", kGcps, "--closed-form"}},
        {1,
         "--closed-form needs a rigorous (srit)",
         {"transform", poly, "--to-image", kGcps, "--closed-form"}},
        {1, "\"dfIFOV\"", {"segment", seg}},
        {1, "rf_scene_RPC.TXT", {"rpc", "--fit", rpc, out}},
        {1, "invalid height range", {"rpc", "--fit", srit, out, "--heights", "900", "100"}},
        {1, "image size 0 x 12000", {"rpc", "--fit", srit, out, "--pixels", "0"}},
        {2, "--heights applies to --fit only", {"rpc", srit, out, "--heights", "0", "1"}},
        {1, "give --to", {"rpc", rpc, Path("x.unknown")}},
        {1, "not a rational function model", {"rpc", poly, Path("x_RPC.TXT")}},
        {1, "geographic", {"gcps", "convert", "--geosys", "EPSG:5773", "--height-ref", "E", kGcps}},
        {1, "-10000000:", {"simulate", "--segment", out, "--gcps", out, "--min-height", "-1e7"}},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.expected);
        Expect(c.args, c.nCode, c.expected);
        EXPECT_EQ(ReadText(out), "precious\n");
        EXPECT_FALSE(std::filesystem::exists(out + ".tmp"));
        EXPECT_FALSE(std::filesystem::exists(adj));
    }
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

TEST_F(CliChecks, HeightsAreGivenAndGroundCoordinatesConverted) {
    const std::string poly = kExamples + "poly_utm31.json";
    const std::string pts = Write("i.csv", "pixel,line\n5000,5000\n");
    const RunResult r = Expect(
        {"transform", kExamples + "rf_scene.json", "--to-ground", pts, "--height", "100"}, 0, "");
    EXPECT_NE(r.osOut.find("pixel,line,z,x,y,status\n5000,5000,100,"), std::string::npos);
    // Polynomials do not depend on the height: no z is needed there.
    Expect({"transform", poly, "--to-ground", pts}, 0, "");
    // The bundled points in WGS 84 degrees (converted by the control point
    // conversion) map to the same image positions once declared.
    Expect({"gcps", "convert", "--geosys", kUtm, "--height-ref", "E", kGcps, "-o", Path("ll.csv")},
           0, "");
    const RunResult utm = Expect({"transform", poly, "--to-image", kGcps}, 0, "");
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
}

}  // namespace
