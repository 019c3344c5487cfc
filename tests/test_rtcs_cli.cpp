// The radar model in the tool: simulate, fit, residuals, transforms both
// ways, the model file read back, and the errors of each step.
#include <gtest/gtest.h>

#include <cstdio>
#include <string>

#include "support/cli_runner.h"

namespace {

using lumo::support::ReadText;
using lumo::support::RunResult;
using lumo::support::RunTool;

class RtcsCliTest : public lumo::support::ScratchDirTest {
  protected:
    RtcsCliTest() : ScratchDirTest("lumo_rtcs_cli_") {}
};

double RmsImage(const std::string& text) {
    double dfRms = -1.0;
    const std::size_t at = text.find(", image ");
    if (at != std::string::npos) std::sscanf(text.c_str() + at, ", image %lf", &dfRms);
    return dfRms;
}

TEST_F(RtcsCliTest, SimulateFitEvaluateAndRefuseBadInput) {
    const std::string seg = Path("seg.json"), gcps = Path("gcps.csv"), checks = Path("chk.csv");
    const std::string model = Path("rtcs.json");
    RunResult r = RunTool({"simulate",     "--radar", "--segment",      seg,
                           "--gcps",       gcps,      "--checks",       checks,
                           "--count",      "12",      "--check-count",  "30",
                           "--max-height", "1500",    "--pixels",       "600",
                           "--lines",      "500",     "--left-looking", "--far-range-first",
                           "--ascending"});
    ASSERT_EQ(r.nCode, 0) << r.osErr;
    r = RunTool({"fit", "--model", "rtcs", "--segment", seg, "--gcps", gcps, "-o", model});
    EXPECT_EQ(r.nCode, 1);  // the height reference must be said
    EXPECT_NE(r.osErr.find("--height-ref"), std::string::npos) << r.osErr;
    r = RunTool({"fit", "--model", "rtcs", "--segment", seg, "--gcps", gcps, "--height-ref", "E",
                 "-o", model});
    ASSERT_EQ(r.nCode, 0) << r.osErr;
    r = RunTool({"residuals", model, "--gcps", checks});
    ASSERT_EQ(r.nCode, 0) << r.osErr;
    EXPECT_LT(RmsImage(r.osOut), 0.5) << r.osOut;
    EXPECT_GE(RmsImage(r.osOut), 0.0) << r.osOut;
    r = RunTool({"transform", model, "--to-ground", checks, "-o", Path("ground.csv")});
    ASSERT_EQ(r.nCode, 0) << r.osErr;
    r = RunTool({"transform", model, "--to-image", Path("ground.csv")});
    ASSERT_EQ(r.nCode, 0) << r.osErr;

    // A model file whose segment was damaged is refused by name.
    std::string damaged = ReadText(model);
    const std::size_t lines = damaged.find("\"nNumLines\": 500");
    ASSERT_NE(lines, std::string::npos);
    damaged.replace(lines, 16, "\"nNumLines\": 900");
    r = RunTool({"transform", Write("damaged.json", damaged), "--to-image", checks});
    EXPECT_EQ(r.nCode, 1);
    EXPECT_NE(r.osErr.find("\"lines\""), std::string::npos) << r.osErr;
}

}  // namespace
