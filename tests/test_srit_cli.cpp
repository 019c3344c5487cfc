// The rigorous model in the tool: simulate, fit, residuals, exact transform,
// the model file round trip and the errors of each step.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <string>

#include "cli.h"
#include "elevation_separation.h"
#include "model_io.h"
#include "points_io.h"
#include "runtime.h"
#include "srit_io.h"
#include "support/cli_runner.h"

namespace {

using lumo::support::RunOk;
using lumo::support::RunResult;

class SritCliTest : public lumo::support::ScratchDirTest {
  protected:
    SritCliTest() : ScratchDirTest("lumo_srit_cli_") {}
};

TEST_F(SritCliTest, SimulateFitResidualsAndExactTransform) {
    const std::string seg = Path("seg.json"), gcps = Path("gcps.csv"), checks = Path("chk.csv");
    const std::string model = Path("model.json");
    RunResult r = RunOk({"simulate", "--segment", seg, "--gcps", gcps, "--checks", checks, "--roll",
                         "20", "--seed", "3", "--check-count", "50"});
    EXPECT_NE(r.osOut.find("10 control points"), std::string::npos) << r.osOut;
    r = RunOk({"fit", "--model", "srit", "--segment", seg, "--gcps", gcps, "-o", model});
    EXPECT_NE(r.osOut.find("sensor SPOT5_PAN_5 (code 55, class 1)"), std::string::npos) << r.osOut;
    r = RunOk({"residuals", model, "--gcps", checks});
    double dfPixel = 9, dfLine = 9;
    const std::size_t nAt = r.osOut.find("# rms dpixel ");
    ASSERT_NE(nAt, std::string::npos) << r.osOut;
    ASSERT_EQ(std::sscanf(&r.osOut[nAt], "# rms dpixel %lf, dline %lf", &dfPixel, &dfLine), 2);
    EXPECT_LT(dfPixel, 0.5);
    EXPECT_LT(dfLine, 0.5);
    // The exact inverse (the default) writes image points that read back.
    r = RunOk({"transform", model, "--to-image", checks, "-o", Path("exact.csv")});
    using lumo::cli::PointKind;
    EXPECT_EQ(lumo::cli::ReadPointsFile(Path("exact.csv"), PointKind::ControlPoint).asPoints.size(),
              lumo::cli::ReadPointsFile(checks, PointKind::ControlPoint).asPoints.size());
    // The model file reads back to the same coefficients.
    const lumo::cli::LoadedModel loaded = lumo::cli::ReadModelFile(model);
    ASSERT_EQ(loaded.nModelCode, LUMO_CODE_SRIT);
    const auto* psModel = static_cast<const SRITInfo_t*>(loaded.poRecord.get());
    const nlohmann::json written = nlohmann::json::parse(lumo::support::ReadText(model));
    EXPECT_EQ(lumo::cli::SritToJson(*psModel)["srit"]["coefficients"],
              written["srit"]["coefficients"]);
    EXPECT_EQ(psModel->psEphemeris->nNumLines, 12000);
    // The curved elevation scale is the tool's default and travels with the
    // file; the classic one is asked for, and a file without the field (as
    // written before it existed) reads as classic.
    const auto fnForm = [](const std::string& osPath) {
        const lumo::cli::LoadedModel m = lumo::cli::ReadModelFile(osPath);
        return static_cast<const SRITInfo_t*>(m.poRecord.get())->anAux[SRIT_AUX_FORM];
    };
    EXPECT_EQ(written["srit"]["elevationScale"], "curved");
    EXPECT_EQ(psModel->anAux[SRIT_AUX_FORM], SRIT_FORM_CURVED_INCIDENCE);
    r = RunOk({"fit", "--model", "srit", "--segment", seg, "--gcps", gcps, "-o", model,
               "--elevation-scale", "classic"});
    EXPECT_EQ(fnForm(model), SRIT_FORM_CLASSIC);
    nlohmann::json old = written;
    old["srit"].erase("elevationScale");
    EXPECT_EQ(fnForm(Write("old.json", old.dump())), SRIT_FORM_CLASSIC);
}

// `lumo block` on the bundled stereo project: without options only images
// whose control points cannot separate the elevation terms are constrained,
// and the report says why; --constrain sets every segment's constraint flag
// (the report and the written models say so) and the pair still checks
// well.
TEST_F(SritCliTest, BlockOnTheBundledStereoProject) {
    const std::string examples = std::string(LUMO_SOURCE_DIR) + "/examples/";
    const std::string project = examples + "block_stereo.json";
    RunResult r = RunOk({"block", project, "-o", mDir.string()});
    nlohmann::json report = nlohmann::json::parse(lumo::support::ReadText(Path("report.json")));
    ASSERT_EQ(report["images"].size(), 2u);
    EXPECT_EQ(report["tiePoints"].size(), 12u);
    EXPECT_EQ(report["controlPoints"].size(), 12u);
    for (const auto& image : report["images"]) {
        const auto& separation = image["elevationSeparation"];
        const bool bWeak = std::min(separation["across"].get<double>(),
                                    separation["along"].get<double>()) < lumo::cli::kWeakSeparation;
        EXPECT_EQ(image["constrained"].get<bool>(), bWeak);
        if (bWeak) {
            EXPECT_EQ(image["constrainedBy"], "weak control points");
        }
    }
    r = RunOk({"block", project, "-o", mDir.string(), "--constrain"});
    report = nlohmann::json::parse(lumo::support::ReadText(Path("report.json")));
    for (const auto& image : report["images"]) {
        EXPECT_TRUE(image["constrained"].get<bool>());
        EXPECT_EQ(image["constrainedBy"], "--constrain");
        EXPECT_LT(image["checkResiduals"]["rmsPixel"].get<double>(), 0.5);
        EXPECT_LT(image["checkResiduals"]["rmsLine"].get<double>(), 0.5);
        const lumo::cli::LoadedModel model =
            lumo::cli::ReadModelFile(image["model"].get<std::string>());
        const auto* psModel = static_cast<const SRITInfo_t*>(model.poRecord.get());
        EXPECT_EQ(psModel->psEphemeris->nSupplementFlag, 1);
    }
}

}  // namespace
