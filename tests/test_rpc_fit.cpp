// Rational polynomials fitted to any model: every sample model is matched on
// the independent check grid within what the family's shape allows, the
// written text reads back to the fitted record, and bad requests are named.

#include <gtest/gtest.h>

#include <string>

#include "lumo.h"
#include "model_io.h"
#include "model_object.h"
#include "rpc_fit.h"
#include "support/cli_runner.h"

namespace {

class RpcFitTest : public lumo::support::ScratchDirTest {
  protected:
    RpcFitTest() : ScratchDirTest("lumo_rpc_fit_") {}
};

TEST_F(RpcFitTest, FitsEverySampleModelWithinItsShape) {
    // Rigorous, radar and rational models are smooth enough for a cubic
    // ratio to follow them to thousandths of a pixel; a spline through
    // control points and a frame camera with lens distortion only to
    // hundredths; a scanner whose swath spans thousands of kilometres only
    // to a few pixels.
    const std::pair<const char*, double> aCases[] = {
        {"srit_spot5_roll20.json", 0.02}, {"poly_utm31.json", 1e-3},    {"rf_scene.json", 1e-3},
        {"tps_utm31.json", 0.1},          {"ap_frame_utm31.json", 0.2}, {"rtcs_scene.json", 0.01},
        {"lrs_avhrr_pass.json", 4.0}};
    for (const auto& [pszFile, dfBound] : aCases) {
        const lumo::cli::LoadedModel model =
            lumo::cli::ReadModelFile(std::string(LUMO_SOURCE_DIR "/examples/") + pszFile);
        const auto poObject = lumo::cli::MakeModelObject(model);
        const lumo::cli::RpcFit sFit = lumo::cli::FitRpcToModel(
            *poObject, model.sEnvelope.nPixels, model.sEnvelope.nLines, 0.0, 1500.0);
        EXPECT_LT(sFit.sCheck.dfMax, dfBound) << pszFile;
        EXPECT_GT(sFit.sCheck.nPoints, 2000) << pszFile;
    }
}

TEST_F(RpcFitTest, WritesWhatItFittedAndNamesBadRequests) {
    const std::string osModel = LUMO_SOURCE_DIR "/examples/srit_spot5_roll20.json";
    const lumo::support::RunResult sRun = lumo::support::RunTool(
        {"rpc", "--fit", osModel, Path("scene_RPC.TXT"), "--heights", "0", "1000"});
    ASSERT_EQ(sRun.nCode, 0) << sRun.osErr;
    EXPECT_NE(sRun.osOut.find("independent check grid: max"), std::string::npos) << sRun.osOut;
    const std::string osText = lumo::support::ReadText(Path("scene_RPC.TXT"));
    RFInfo_t* psRF = LumoRPCTextToRFInfo(osText.data(), osText.size(), LUMO_RPC_TEXT_TXT, "t");
    EXPECT_NEAR(psRF->dfZOffset, 500.0, 1e-9);
    EXPECT_NEAR(psRF->dfZScale, 500.0, 1e-9);
    RFDeallocate(psRF);
    const lumo::support::RunResult sRadar = lumo::support::RunTool(
        {"rpc", "--fit", LUMO_SOURCE_DIR "/examples/rtcs_scene.json", Path("radar.RPB")});
    ASSERT_EQ(sRadar.nCode, 0) << sRadar.osErr;
    EXPECT_NE(sRadar.osOut.find("(rtcs), 1000 x 1000 pixels"), std::string::npos) << sRadar.osOut;
    const std::string osRpb = lumo::support::ReadText(Path("radar.RPB"));
    psRF = LumoRPCTextToRFInfo(osRpb.data(), osRpb.size(), LUMO_RPC_TEXT_RPB, "t");
    EXPECT_NEAR(psRF->dfZOffset, 1000.0, 1e-9);
    RFDeallocate(psRF);

    const std::pair<std::vector<std::string>, std::string> aBad[] = {
        {{"--fit", LUMO_SOURCE_DIR "/examples/rf_scene_RPC.TXT", Path("o_RPC.TXT")},
         "rf_scene_RPC.TXT"},
        {{"--fit", osModel, Path("o_RPC.TXT"), "--heights", "900", "100"}, "invalid height range"},
        {{"--fit", osModel, Path("o_RPC.TXT"), "--pixels", "0"}, "image size 0 x 12000"},
    };
    for (const auto& [asArgs, osNamed] : aBad) {
        std::vector<std::string> asRun = {"rpc"};
        asRun.insert(asRun.end(), asArgs.begin(), asArgs.end());
        const lumo::support::RunResult sBad = lumo::support::RunTool(asRun);
        EXPECT_EQ(sBad.nCode, 1) << osNamed;
        EXPECT_NE(sBad.osErr.find(osNamed), std::string::npos) << sBad.osErr;
    }
    EXPECT_NE(lumo::support::RunTool({"rpc", osModel, Path("o.RPB"), "--heights", "0", "1"}).nCode,
              0);
}

}  // namespace
