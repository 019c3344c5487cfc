// Progress of long work: nothing when standard error is not a terminal (as
// under the test runner), shown when asked for with LUMO_PROGRESS=always.
#include <gtest/gtest.h>

#include <cstdlib>
#include <string>

#include "support/cli_runner.h"

namespace {

const std::string kGcps = std::string(LUMO_SOURCE_DIR) + "/examples/poly_utm31_gcps.csv";

class ProgressTest : public lumo::support::ScratchDirTest {
  protected:
    ProgressTest() : ScratchDirTest("lumo_progress_") {}

    // What a spline fit and a transform write to the process's standard error.
    std::string Stderr() {
        testing::internal::CaptureStderr();
        const auto fit =
            lumo::support::RunTool({"fit", "--model", "tps", "--gcps", kGcps, "--geosys",
                                    "UTM 31 U D000", "-o", Path("t.json")});
        const auto map = lumo::support::RunTool({"transform", Path("t.json"), "--to-image", kGcps});
        EXPECT_EQ(fit.nCode + map.nCode, 0) << fit.osErr << map.osErr;
        return testing::internal::GetCapturedStderr();
    }
};

TEST_F(ProgressTest, QuietUnlessATerminalOrAskedFor) {
    EXPECT_EQ(Stderr(), "");
    setenv("LUMO_PROGRESS", "always", 1);
    const std::string shown = Stderr();
    setenv("LUMO_PROGRESS", "never", 1);
    EXPECT_EQ(Stderr(), "");
    unsetenv("LUMO_PROGRESS");
    EXPECT_NE(shown.find("\rlumo fit: fitting the thin plate spline to 15 control points... 0 s"),
              std::string::npos)
        << shown;
    EXPECT_NE(shown.find("\rtransforming 100%"), std::string::npos) << shown;
}

}  // namespace
