// The orbit model in the tool: simulate a pass, fit, residuals on check
// points, transforms, the model file round trip, angle layers and the
// refusals.
#include <gtest/gtest.h>

#include <array>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>

#include "lrs_io.h"
#include "model_io.h"
#include "runtime.h"
#include "support/cli_runner.h"

namespace {

using lumo::support::RunResult;
using lumo::support::RunTool;

class LrsCliTest : public lumo::support::ScratchDirTest {
  protected:
    LrsCliTest() : ScratchDirTest("lumo_lrs_cli_") {}
};

TEST_F(LrsCliTest, SimulateFitCheckWriteAnglesAndRefuseWhatItCannotUse) {
    const std::string seg = Path("pass.json"), gcps = Path("gcps.csv"), checks = Path("chk.csv");
    const std::string model = Path("model.json");
    RunResult r = RunTool({"simulate-avhrr", "--segment", seg, "--gcps", gcps, "--checks", checks,
                           "--lines", "300", "--roll-bias", "0.1", "--along-track-bias", "2"});
    ASSERT_EQ(r.nCode, 0) << r.osErr;
    r = RunTool({"fit", "--model", "lrs", "--segment", seg, "--gcps", gcps, "-o", model});
    ASSERT_EQ(r.nCode, 0) << r.osErr;
    EXPECT_NE(r.osOut.find("refined with 20 control points"), std::string::npos) << r.osOut;
    // The same points undeclared, their georeferencing given by EPSG code,
    // fit the same model.
    std::string plain = lumo::support::ReadText(gcps);
    plain = Write("plain.csv", plain.erase(0, plain.find('\n') + 1));
    r = RunTool({"fit", "--model", "lrs", "--segment", seg, "--gcps", plain, "--geosys",
                 "EPSG:4326", "-o", Path("epsg.json")});
    ASSERT_EQ(r.nCode, 0) << r.osErr;
    EXPECT_EQ(lumo::support::ReadText(Path("epsg.json")), lumo::support::ReadText(model));
    r = RunTool({"residuals", model, "--gcps", checks});
    ASSERT_EQ(r.nCode, 0) << r.osErr;
    double dfPixel = 0.0, dfLine = 0.0;
    const std::size_t at = r.osOut.find("# rms dpixel ");
    ASSERT_NE(at, std::string::npos) << r.osOut;
    ASSERT_EQ(std::sscanf(r.osOut.c_str() + at, "# rms dpixel %lf, dline %lf", &dfPixel, &dfLine),
              2);
    EXPECT_LT(std::hypot(dfPixel, dfLine), 0.05);

    // The model file reads back to the same model and writes the same text.
    const lumo::cli::LoadedModel loaded = lumo::cli::ReadModelFile(model);
    ASSERT_EQ(loaded.nModelCode, LUMO_CODE_LRS);
    const auto* psModel = static_cast<const LRSOrbitModel_t*>(loaded.poRecord.get());
    EXPECT_EQ(lumo::cli::LrsToJson(*psModel), lumo::cli::ParseJsonFile(model));
    EXPECT_NE(psModel->padfStates, nullptr);

    // Angle layers: CSV with a step, raw float32 with its header.
    r = RunTool({"angles", model, "-o", Path("a.csv"), "--step", "16"});
    ASSERT_EQ(r.nCode, 0) << r.osErr;
    const std::string csv = lumo::support::ReadText(Path("a.csv"));
    EXPECT_NE(csv.find("pixel,line,sat_zenith,sat_azimuth,sun_zenith,sun_azimuth,rel_azimuth"),
              std::string::npos);
    EXPECT_EQ(std::count(csv.begin(), csv.end(), '\n'), 2 + 128 * 19);
    r = RunTool({"angles", model, "-o", Path("a.raw"), "--format", "raw"});
    ASSERT_EQ(r.nCode, 0) << r.osErr;
    EXPECT_EQ(std::filesystem::file_size(Path("a.raw")), 5U * 2048U * 300U * 4U);
    EXPECT_NE(lumo::support::ReadText(Path("a.raw.hdr")).find("interleave = bsq"),
              std::string::npos);

    // A model file with an impossible element names the field; angles want
    // an orbit model.
    std::string text = lumo::support::ReadText(model);
    text.insert(text.find_first_of("0123456789", text.find("\"meanElements\"")), "-");
    std::ofstream(Path("bad.json")) << text;
    r = RunTool({"transform", Path("bad.json"), "--to-image", gcps});
    EXPECT_EQ(r.nCode, 1);
    EXPECT_NE(r.osErr.find("adfMeanElements[0]"), std::string::npos) << r.osErr;
    r = RunTool({"angles", LUMO_SOURCE_DIR "/examples/poly_utm31.json", "-o", Path("x.csv")});
    EXPECT_EQ(r.nCode, 1);
    EXPECT_FALSE(std::filesystem::exists(Path("x.csv")));
    // Simulation parameters out of range are named with their value; nothing is written.
    const std::array<std::array<const char*, 3>, 2> cases{
        {{"--roll-bias", "nan", "roll bias nan"}, {"--day", "366", "epoch day 366"}}};
    for (const auto& [option, value, says] : cases) {
        r = RunTool({"simulate-avhrr", "--segment", Path("s.json"), "--gcps", Path("g.csv"),
                     "--year", "2003", option, value});
        EXPECT_EQ(r.nCode, 1);
        EXPECT_NE(r.osErr.find(says), std::string::npos) << r.osErr;
        EXPECT_FALSE(std::filesystem::exists(Path("s.json")));
    }
}

}  // namespace
