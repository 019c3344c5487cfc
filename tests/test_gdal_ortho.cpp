// Orthorectification: marks of a simulated image land on their map
// positions; the geometry agrees with gdalwarp on the same inputs; every
// band and data type is carried; bad input fails naming the culprit and
// leaves no file behind.

#include <gtest/gtest.h>

#include <cmath>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "lumo.h"
#include "lumo_gdal.h"
#include "marked_scene.h"
#include "model_object.h"
#include "rf_io.h"
#include "runtime.h"
#include "srit_io.h"
#include "support/cli_runner.h"
#include "support/gdal_rasters.h"
#include "support/numbered_error.h"

namespace {

using lumo::support::RasterSpec;
using nova::dem::DEMPtr;
namespace fs = std::filesystem;

class OrthoTest : public lumo::support::ScratchDirTest {
  protected:
    OrthoTest() : ScratchDirTest("lumo_gdal_ortho_") {}

    // A 600 x 500 image whose two bands hold each pixel centre's own column and
    // line, with rational polynomials in an _RPC.TXT sidecar, and an elevation
    // file in longitude and latitude under it.
    void WriteRpcScene() {
        // Newline first, so that every key follows one.
        std::string osRpc =
            "\n" + lumo::support::ReadText(LUMO_SOURCE_DIR "/examples/rf_scene_RPC.TXT");
        const std::pair<const char*, const char*> aScaled[] = {
            {"LINE_OFF", "250"},   {"SAMP_OFF", "300"},     {"LINE_SCALE", "250"},
            {"SAMP_SCALE", "300"}, {"LAT_SCALE", "0.0055"}, {"LONG_SCALE", "0.008"}};
        for (const auto& [pszKey, pszValue] : aScaled) {
            const std::size_t nKey = osRpc.find(std::string("\n") + pszKey + ": ");
            ASSERT_NE(nKey, std::string::npos) << pszKey;
            const std::size_t nValue = nKey + std::strlen(pszKey) + 3;
            osRpc.replace(nValue, osRpc.find('\n', nValue) - nValue, pszValue);
        }
        Write("image_RPC.TXT", osRpc.substr(1));
        lumo::support::WriteRaster(Path("image.tif"), lumo::support::PlainImage(600, 500, 2),
                                   [](int b, int c, int r) { return b == 1 ? c + 0.5 : r + 0.5; });
        lumo::support::WriteRaster(
            Path("dem.tif"), lumo::support::NorthUpGrid(200, 200, "EPSG:4326", 7.43, 46.97, 0.0002),
            [](int, int c, int r) {
                return 800.0 + 300.0 * std::sin(c / 20.0) * std::cos(r / 25.0);
            });
    }

    static std::unique_ptr<nova::mathmodel::IMathModel> ImageRpcModel(const std::string& osPath,
                                                                      int nPixels = 600,
                                                                      int nLines = 500) {
        lumo::cli::RFPtr psRF(lumo::gdal::ReadImageRPC(osPath));
        return lumo::cli::MakeRpcModelObject(lumo::cli::ShareRFRecord(std::move(psRF)), nPixels,
                                             nLines);
    }

    // Largest difference, in image pixels, between the coordinate bands of
    // two orthoimages of the coordinate image, away from the footprint's edge.
    double GeometryDifference(const std::string& osA, const std::string& osB) {
        int nCols = 0, nRows = 0, nColsB = 0, nRowsB = 0;
        std::vector<double> adfA[2], adfB[2];
        for (int b = 0; b < 2; ++b) {
            adfA[b] = lumo::support::ReadBand(osA, b + 1, &nCols, &nRows);
            adfB[b] = lumo::support::ReadBand(osB, b + 1, &nColsB, &nRowsB);
        }
        EXPECT_EQ(nCols, nColsB);
        EXPECT_EQ(nRows, nRowsB);
        double dfWorst = 0.0;
        int nCompared = 0;
        for (std::size_t i = 0; i < adfA[0].size(); ++i) {
            // Two pixels inside the image on both, so no edge pixel counts.
            const bool bInside = adfA[0][i] > 2 && adfA[0][i] < 598 && adfA[1][i] > 2 &&
                                 adfA[1][i] < 498 && adfB[0][i] > 2 && adfB[1][i] > 2;
            if (!bInside) continue;
            ++nCompared;
            dfWorst = std::max(
                {dfWorst, std::fabs(adfA[0][i] - adfB[0][i]), std::fabs(adfA[1][i] - adfB[1][i])});
        }
        EXPECT_GT(nCompared, 200000);
        return dfWorst;
    }
};

TEST_F(OrthoTest, MarksLandOnTheirMapPositionsThroughTheModelAndItsExportedPolynomials) {
    lumo::sim::SceneParams sParams;
    sParams.nPixels = sParams.nLines = 320;
    sParams.dfRollDeg = 15.0;
    sParams.nUtmZone = 31;
    const lumo::sim::Scene oScene(sParams);
    double dfX0 = 0.0, dfY0 = 0.0;
    ASSERT_TRUE(oScene.ImageToGround(160.0, 160.0, 600.0, &dfX0, &dfY0));
    // Smooth hills of 200 to 1000 m on 20 m cells, 6 km around the scene's centre.
    lumo::support::WriteRaster(
        Path("hills.tif"),
        lumo::support::NorthUpGrid(300, 300, "EPSG:32631", dfX0 - 3000.0, dfY0 + 3000.0, 20.0),
        [](int, int c, int r) {
            return 600.0 + 400.0 * std::sin((c - 149.5) * 20.0 / 700.0) *
                               std::cos((r - 149.5) * 20.0 / 900.0);
        });
    DEMPtr poDem(lumo::gdal::OpenFileDEM(Path("hills.tif"), lumo::gdal::FileDEMOptions{}));
    const lumo::cli::MarkedScene sScene =
        lumo::cli::MakeMarkedScene(sParams, *poDem, 4, 20, Path("scene.tif"));
    const nova::mathmodel::LumoMathModel oModel(LUMO_CODE_SRIT, sScene.psModel.get());

    // The rigorous model, then its rational polynomials fitted over the
    // hills' heights (200 to 1000 m above sea level, some 50 m more above
    // the ellipsoid) and read back by the ortho run from the image's sidecar:
    // a wrong height reference in the fit would move the marks by pixels.
    std::ofstream(Path("srit.json")) << lumo::cli::SritToJson(*sScene.psModel).dump();
    const lumo::support::RunResult sFit = lumo::support::RunTool(
        {"rpc", "--fit", Path("srit.json"), Path("scene.RPB"), "--heights", "150", "1150"});
    ASSERT_EQ(sFit.nCode, 0) << sFit.osErr;
    const auto poRpc = ImageRpcModel(Path("scene.tif"), 320, 320);
    const std::vector<const nova::mathmodel::IMathModel*> apoModels = {&oModel, poRpc.get()};
    for (const nova::mathmodel::IMathModel* poModel : apoModels) {
        lumo::gdal::OrthoOptions sOptions;
        sOptions.osOutputCRS = "EPSG:32631";
        const lumo::gdal::OrthoGrid sGrid = lumo::gdal::Orthorectify(
            Path("scene.tif"), *poModel, *poDem, Path("ortho.tif"), sOptions);
        EXPECT_NEAR(sGrid.adfGeoTransform[1], 5.0, 0.5);  // the model's ground sample distance
        const lumo::cli::MarkStats sStats = lumo::cli::MeasureMarks(Path("ortho.tif"), sScene);
        EXPECT_EQ(sStats.nFound, 16);
        EXPECT_LT(sStats.dfMax, 0.5) << "rms " << sStats.dfRms;
        RecordProperty(poModel == &oModel ? "MarkErrorMaxPxRigorous" : "MarkErrorMaxPxRpc",
                       std::to_string(sStats.dfMax));
    }
}

TEST_F(OrthoTest, GeometryAgreesWithGdalwarpOnTheSameInputs) {
    WriteRpcScene();
    const auto poModel = ImageRpcModel(Path("image.tif"));
    lumo::gdal::FileDEMOptions sDemOptions;
    // gdalwarp takes heights of a file without vertical CRS as ellipsoidal.
    sDemOptions.eHeights = lumo::gdal::HeightReference::kEllipsoid;
    DEMPtr poDem(lumo::gdal::OpenFileDEM(Path("dem.tif"), sDemOptions));
    lumo::gdal::OrthoOptions sOptions;
    sOptions.osOutputCRS = "EPSG:32632";
    const lumo::gdal::OrthoGrid sGrid =
        lumo::gdal::Orthorectify(Path("image.tif"), *poModel, *poDem, Path("lumo.tif"), sOptions);
    // gdalwarp with exact transformations (no approximation threshold).
    const double* gt = sGrid.adfGeoTransform;
    const std::string osCommand = nova::FormatString(
        "gdalwarp -q -overwrite -rpc -to RPC_DEM=%s -t_srs EPSG:32632 -te %.17g %.17g %.17g "
        "%.17g -ts %d %d -r bilinear -et 0 -dstnodata 0 %s %s",
        Path("dem.tif").c_str(), gt[0], gt[3] + sGrid.nLines * gt[5], gt[0] + sGrid.nPixels * gt[1],
        gt[3], sGrid.nPixels, sGrid.nLines, Path("image.tif").c_str(),
        Path("gdalwarp.tif").c_str());
    ASSERT_EQ(std::system(osCommand.c_str()), 0) << osCommand;
    // Ours, approximated within its default threshold, agrees to a hundredth.
    const double dfDifference = GeometryDifference(Path("lumo.tif"), Path("gdalwarp.tif"));
    EXPECT_LT(dfDifference, 0.01);
    RecordProperty("DifferencePx", std::to_string(dfDifference));
}

TEST_F(OrthoTest, CarriesEveryBandAndTypeIntoCloudOptimizedFiles) {
    WriteRpcScene();
    // A new name: writing over image.tif would remove its sidecar with it.
    lumo::support::WriteRaster(Path("multi.tif"),
                               lumo::support::PlainImage(600, 500, 3, GDT_UInt16),
                               [](int b, int, int) { return 1000 * b; });
    Write("multi_RPC.TXT", lumo::support::ReadText(Path("image_RPC.TXT")));
    const auto poModel = ImageRpcModel(Path("multi.tif"));
    DEMPtr poGeoid(nova::dem::DEMFactory::CreateDEM("geoid", 8));
    lumo::gdal::OrthoOptions sOptions;
    sOptions.eResampling = lumo::gdal::Resampling::kNearest;
    sOptions.bCloudOptimized = true;
    sOptions.nThreads = 2;
    double dfLastProgress = -1.0;
    sOptions.fnProgress = [&](double dfDone) {
        EXPECT_GE(dfDone, dfLastProgress);
        dfLastProgress = dfDone;
        return true;
    };
    lumo::gdal::Orthorectify(Path("multi.tif"), *poModel, *poGeoid, Path("cog.tif"), sOptions);
    EXPECT_DOUBLE_EQ(dfLastProgress, 1.0);
    for (int b = 1; b <= 3; ++b) {
        int nCols = 0, nRows = 0;
        const std::vector<double> adf = lumo::support::ReadBand(Path("cog.tif"), b, &nCols, &nRows);
        const std::size_t nCentre = static_cast<std::size_t>(nRows / 2) * nCols + nCols / 2;
        EXPECT_EQ(adf[nCentre], 1000.0 * b);
    }
    GDALDatasetH hCog = GDALOpen(Path("cog.tif").c_str(), GA_ReadOnly);
    EXPECT_EQ(GDALGetRasterCount(hCog), 3);
    EXPECT_EQ(GDALGetRasterDataType(GDALGetRasterBand(hCog, 3)), GDT_UInt16);
    EXPECT_STREQ(GDALGetMetadataItem(hCog, "LAYOUT", "IMAGE_STRUCTURE"), "COG");
    GDALClose(hCog);
}

TEST_F(OrthoTest, BadInputFailsNamingItAndLeavesNoFile) {
    WriteRpcScene();
    const auto poModel = ImageRpcModel(Path("image.tif"));
    DEMPtr poDem(lumo::gdal::OpenFileDEM(Path("dem.tif"), lumo::gdal::FileDEMOptions{}));
    // An elevation file far from the scene, a truncated copy of the image,
    // and a model that maps no image point to the ground (no footprint).
    lumo::support::WriteRaster(Path("far.tif"),
                               lumo::support::NorthUpGrid(10, 10, "EPSG:4326", 20.0, 10.0, 0.01),
                               [](int, int, int) { return 5.0; });
    DEMPtr poFar(lumo::gdal::OpenFileDEM(Path("far.tif"), lumo::gdal::FileDEMOptions{}));
    const std::string osImage = lumo::support::ReadText(Path("image.tif"));
    Write("truncated.tif", osImage.substr(0, osImage.size() / 3));
    Write("truncated_RPC.TXT", lumo::support::ReadText(Path("image_RPC.TXT")));
    lumo::cli::RFPtr psBroken(lumo::gdal::ReadImageRPC(Path("image.tif")));
    psBroken->dfXScale = 0.0;
    const auto poBroken =
        lumo::cli::MakeRpcModelObject(lumo::cli::ShareRFRecord(std::move(psBroken)), 600, 500);
    const std::string osOutput = Path("out.tif");
    auto Fails = [&](const std::string& osImagePath, const std::string& osOut,
                     const lumo::gdal::OrthoOptions& sOptions, const std::string& osNamed,
                     const nova::mathmodel::IMathModel& oModel, const nova::dem::IRasterDEM& oDem) {
        const std::string osText = lumo::support::DataErrorOf(
            [&] { lumo::gdal::Orthorectify(osImagePath, oModel, oDem, osOut, sOptions); });
        EXPECT_NE(osText.find(osNamed), std::string::npos) << osNamed << ": " << osText;
        for (const auto& oEntry : fs::directory_iterator(mDir)) {
            EXPECT_EQ(oEntry.path().string().find(".part"), std::string::npos) << oEntry.path();
        }
        EXPECT_FALSE(fs::exists(osOutput));
    };
    lumo::gdal::OrthoOptions sDefaults, sCancel, sBadCRS, sHuge, sUtm;
    Fails(Path("truncated.tif"), osOutput, sDefaults, "truncated.tif", *poModel, *poDem);
    Fails(Path("missing.tif"), osOutput, sDefaults, "missing.tif", *poModel, *poDem);
    Fails(Path("image.tif"), Path("no/such/dir/out.tif"), sDefaults, "no/such/dir/out.tif",
          *poModel, *poDem);
    Fails(Path("image.tif"), osOutput, sDefaults, "does not cover", *poModel, *poFar);
    sCancel.fnProgress = [](double dfDone) { return dfDone < 0.3; };
    Fails(Path("image.tif"), osOutput, sCancel, "cancelled", *poModel, *poDem);
    sBadCRS.osOutputCRS = "EPSG:999999";
    Fails(Path("image.tif"), osOutput, sBadCRS, "EPSG:999999", *poModel, *poDem);
    sHuge.dfResolution = 1e-4;
    Fails(Path("image.tif"), osOutput, sHuge, "coarser resolution", *poModel, *poDem);
    sUtm.osOutputCRS = "EPSG:32632";
    Fails(Path("image.tif"), osOutput, sUtm, "footprint cannot be computed", *poBroken, *poDem);

    lumo::support::WriteRaster(Path("plain.tif"), lumo::support::PlainImage(10, 10),
                               [](int, int, int) { return 1.0; });
    const std::string osPlain = lumo::support::DataErrorOf(
        [&] { lumo::cli::RFPtr(lumo::gdal::ReadImageRPC(Path("plain.tif"))); });
    EXPECT_NE(osPlain.find("plain.tif"), std::string::npos) << osPlain;
}

// The tool's options reach the run; what only the tool checks is refused by
// name and leaves no file.
TEST_F(OrthoTest, ToolWritesOrthoimagesAndNamesWhatIsWrong) {
    WriteRpcScene();
    auto Run = [&](std::vector<std::string> asArgs) {
        asArgs.insert(asArgs.begin(), {"ortho", Path("image.tif"), Path("out.tif")});
        return lumo::support::RunTool(asArgs);
    };
    const lumo::support::RunResult sOk =
        Run({"--dem", Path("dem.tif"), "--dem-heights", "ellipsoid", "--crs", "32632"});
    EXPECT_EQ(sOk.nCode, 0) << sOk.osErr;
    EXPECT_NE(sOk.osOut.find("wrote"), std::string::npos) << sOk.osOut;
    EXPECT_TRUE(fs::exists(Path("out.tif")));
    fs::remove(Path("out.tif"));

    const std::pair<std::vector<std::string>, std::string> aBad[] = {
        {{"--model", Path("nomodel.json")}, "nomodel.json"},
        {{"--crs", "EPSG:4326+bogus"}, "EPSG:4326+bogus"},
    };
    for (const auto& [asArgs, osNamed] : aBad) {
        const lumo::support::RunResult sRun = Run(asArgs);
        EXPECT_EQ(sRun.nCode, 1) << osNamed;
        EXPECT_NE(sRun.osErr.find(osNamed), std::string::npos) << sRun.osErr;
        EXPECT_FALSE(fs::exists(Path("out.tif"))) << osNamed;
    }
    EXPECT_NE(Run({"--resampling", "sharp"}).nCode, 0);
}

}  // namespace
