// Georeferencing texts through the tool: EPSG codes and PROJ strings where
// the tool takes a georeferencing text, and the warning for UTM points far
// outside the latitude band their text names.
#include <gtest/gtest.h>

#include <string>

#include <nlohmann/json.hpp>

#include "support/cli_runner.h"

namespace {

const std::string kGcps = std::string(LUMO_SOURCE_DIR) + "/examples/poly_utm31_gcps.csv";

using lumo::support::ReadText;
using lumo::support::RunTool;

class GeosysCliTest : public lumo::support::ScratchDirTest {
  protected:
    GeosysCliTest() : ScratchDirTest("lumo_geosys_") {}

    nlohmann::json Fit(const std::string& geosys, const std::string& name, std::string* err) {
        const auto r = RunTool({"fit", "--model", "poly", "--order", "2", "--gcps", kGcps,
                                "--geosys", geosys, "-o", Path(name)});
        EXPECT_EQ(r.nCode, 0) << geosys << ": " << r.osErr;
        *err = r.osErr;
        return nlohmann::json::parse(ReadText(Path(name)));
    }
};

TEST_F(GeosysCliTest, ForeignFormsFitTheSameModelAndBandsAreChecked) {
    std::string err;
    const nlohmann::json native = Fit("UTM 31 U D000", "native.json", &err);
    EXPECT_EQ(err, "");
    for (const char* foreign : {"EPSG:32631", "+proj=utm +zone=31 +datum=WGS84"}) {
        const nlohmann::json model = Fit(foreign, "foreign.json", &err);
        EXPECT_EQ(model["geosys"], "EPSG:32631") << foreign;
        EXPECT_EQ(model["poly"], native["poly"]) << foreign;
    }
    // Band C lies near 76 S; the points are in France.
    Fit("UTM 31 C D000", "band.json", &err);
    EXPECT_NE(err.find("far outside latitude band C"), std::string::npos) << err;
    EXPECT_NE(err.find("\"UTM 31 U D000\" or \"EPSG:32631\""), std::string::npos) << err;

    const auto byCode =
        RunTool({"gcps", "convert", "--geosys", "EPSG:32631", "--height-ref", "E", kGcps});
    const auto byText =
        RunTool({"gcps", "convert", "--geosys", "UTM 31 U D000", "--height-ref", "E", kGcps});
    EXPECT_EQ(byCode.nCode, 0) << byCode.osErr;
    EXPECT_EQ(byCode.osOut, byText.osOut);
    const auto refused =
        RunTool({"gcps", "convert", "--geosys", "EPSG:5773", "--height-ref", "E", kGcps});
    EXPECT_NE(refused.nCode, 0);
    EXPECT_NE(refused.osErr.find("not a geographic or projected"), std::string::npos);
}

// One system under two texts is no contradiction; two systems are.
TEST_F(GeosysCliTest, PointFileSystemComparedBySystemNotText) {
    const std::string model = std::string(LUMO_SOURCE_DIR) + "/examples/rf_scene.json";
    const auto Transform = [&](const char* declared, const char* x, const char* y,
                               const char* given) {
        const std::string points = Write("g.csv", std::string("# geosys: ") + declared +
                                                      "\nid,x,y,z\nA," + x + "," + y + ",450\n");
        return RunTool({"transform", model, "--to-image", points, "--geosys", given});
    };
    const auto byText = Transform("LONG/LAT D000", "7.3412", "46.8752", "LONG/LAT D000");
    const auto byCode = Transform("LONG/LAT D000", "7.3412", "46.8752", "EPSG:4326");
    EXPECT_EQ(byCode.nCode, 0) << byCode.osErr;
    EXPECT_EQ(byCode.osOut.substr(byCode.osOut.find('\n')),
              byText.osOut.substr(byText.osOut.find('\n')));
    EXPECT_EQ(Transform("UTM 32 D000", "380000", "5190000", "EPSG:32632").nCode, 0);
    const auto other = Transform("UTM 32 D000", "380000", "5190000", "EPSG:32633");
    EXPECT_EQ(other.nCode, 1);
    EXPECT_NE(other.osErr.find("contradicts"), std::string::npos) << other.osErr;
}

}  // namespace
