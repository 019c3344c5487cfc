// Models from image files: rational polynomials read from every carrier GDAL
// knows agree with the text they came from; polynomials attached to a
// GeoTIFF are what GDAL's own RPC transformer evaluates; control points and
// georeferencing come back as stored; `lumo info` shows them.

#include <gtest/gtest.h>

#include <array>
#include <cmath>
#include <filesystem>
#include <string>
#include <vector>

#include <gdal_alg.h>

#include "lumo.h"
#include "lumo_gdal.h"
#include "rf_io.h"
#include "runtime.h"
#include "support/cli_runner.h"
#include "support/gdal_rasters.h"

namespace {

using lumo::cli::RFPtr;
using lumo::support::RasterSpec;

class ImageFileTest : public lumo::support::ScratchDirTest {
  protected:
    ImageFileTest() : ScratchDirTest("lumo_gdal_image_") {}

    RFPtr SceneModel() const {
        const std::string osText =
            lumo::support::ReadText(LUMO_SOURCE_DIR "/examples/rf_scene_RPC.TXT");
        return RFPtr(LumoRPCTextToRFInfo(osText.data(), osText.size(), LUMO_RPC_TEXT_AUTO,
                                         "rf_scene_RPC.TXT"));
    }

    std::string WriteImage(const std::string& osName) {
        RasterSpec sSpec;
        sSpec.nCols = 64;
        sSpec.nRows = 48;
        sSpec.bGeoreferenced = false;
        sSpec.osSRS.clear();
        lumo::support::WriteRaster(Path(osName), sSpec, [](int, int c, int) { return c; });
        return Path(osName);
    }
};

// Image positions of a ground grid over the model's cube, at three heights.
std::vector<std::array<double, 3>> GroundGrid(const RFInfo_t& sRF) {
    std::vector<std::array<double, 3>> aGrid;
    for (int i = -4; i <= 4; ++i)
        for (int j = -4; j <= 4; ++j)
            for (double dfW : {-1.0, 0.0, 1.0})
                aGrid.push_back({sRF.dfXOffset + 0.2 * i * sRF.dfXScale,
                                 sRF.dfYOffset + 0.2 * j * sRF.dfYScale,
                                 sRF.dfZOffset + dfW * sRF.dfZScale});
    return aGrid;
}

double LargestImageDifference(RFInfo_t& sA, RFInfo_t& sB) {
    double dfWorst = 0.0;
    for (const auto& g : GroundGrid(sA)) {
        double dfPA = 0, dfLA = 0, dfPB = 0, dfLB = 0;
        RFGeo2Img(&sA, g[0], g[1], g[2], &dfPA, &dfLA);
        RFGeo2Img(&sB, g[0], g[1], g[2], &dfPB, &dfLB);
        dfWorst = std::max({dfWorst, std::fabs(dfPA - dfPB), std::fabs(dfLA - dfLB)});
    }
    return dfWorst;
}

TEST_F(ImageFileTest, ReadsRationalPolynomialsFromEveryCarrier) {
    RFPtr psTruth = SceneModel();
    // Sidecars in both text forms, and tags inside a GeoTIFF.
    WriteImage("txt.tif");
    Write("txt_RPC.TXT", LumoRFInfoToRPCText(psTruth.get(), LUMO_RPC_TEXT_TXT));
    WriteImage("rpb.tif");
    Write("rpb.RPB", LumoRFInfoToRPCText(psTruth.get(), LUMO_RPC_TEXT_RPB));
    lumo::gdal::AttachRPC(WriteImage("tags.tif"), *psTruth);
    WriteImage("tool.tif");
    ASSERT_EQ(lumo::support::RunTool(
                  {"rpc", LUMO_SOURCE_DIR "/examples/rf_scene_RPC.TXT", Path("tool.tif")})
                  .nCode,
              0);
    for (const char* pszName : {"txt.tif", "rpb.tif", "tags.tif", "tool.tif"}) {
        RFPtr psRead(lumo::gdal::ReadImageRPC(Path(pszName)));
        EXPECT_LT(LargestImageDifference(*psTruth, *psRead), 1e-9) << pszName;
        EXPECT_TRUE(lumo::gdal::ReadImageInfo(Path(pszName)).bHasRPC) << pszName;
    }
    EXPECT_FALSE(lumo::gdal::ReadImageInfo(WriteImage("plain.tif")).bHasRPC);
}

// GDAL's own RPC transformer, reading what AttachRPC stored, against our
// evaluation of the record.
double LargestGdalDifference(const std::string& osPath, RFInfo_t& sRF) {
    GDALDatasetH hDs = GDALOpen(osPath.c_str(), GA_ReadOnly);
    GDALRPCInfoV2 sInfo{};
    const bool bRead = GDALExtractRPCInfoV2(GDALGetMetadata(hDs, "RPC"), &sInfo);
    GDALClose(hDs);
    void* pTransformer = bRead ? GDALCreateRPCTransformerV2(&sInfo, FALSE, 0.0, nullptr) : nullptr;
    if (pTransformer == nullptr) return HUGE_VAL;
    double dfWorst = 0.0;
    for (const auto& g : GroundGrid(sRF)) {
        double dfX = g[0], dfY = g[1], dfZ = g[2];
        int bOk = FALSE;
        // Ground to image is the transformer's inverse direction.
        GDALRPCTransform(pTransformer, TRUE, 1, &dfX, &dfY, &dfZ, &bOk);
        double dfPixel = 0, dfLine = 0;
        RFGeo2Img(&sRF, g[0], g[1], g[2], &dfPixel, &dfLine);
        dfWorst =
            bOk ? std::max({dfWorst, std::fabs(dfX - dfPixel), std::fabs(dfY - dfLine)}) : HUGE_VAL;
    }
    GDALDestroyRPCTransformer(pTransformer);
    return dfWorst;
}

TEST_F(ImageFileTest, AttachedPolynomialsAreWhatGdalEvaluates) {
    RFPtr psTruth = SceneModel();
    const std::string osPath = WriteImage("tags.tif");
    lumo::gdal::AttachRPC(osPath, *psTruth);
    EXPECT_LT(LargestGdalDifference(osPath, *psTruth), 1e-6);

    // An image-space scale and shift in force is folded into the attached
    // polynomials, as in the text forms; a second-order one has no
    // equivalent and is refused, naming why, leaving the file as it was.
    psTruth->nAdjust = 1;
    psTruth->adfPixelAdjust[0] = 1.5;
    psTruth->adfPixelAdjust[1] = 1e-4;
    psTruth->adfLineAdjust[0] = -0.75;
    psTruth->adfLineAdjust[2] = -2e-4;
    lumo::gdal::AttachRPC(osPath, *psTruth);
    EXPECT_LT(LargestGdalDifference(osPath, *psTruth), 1e-6);
    psTruth->adfPixelAdjust[3] = 1e-9;
    try {
        lumo::gdal::AttachRPC(osPath, *psTruth);
        ADD_FAILURE() << "attached a second-order adjustment";
    } catch (const nova::DataException& e) {
        EXPECT_NE(std::string(e.what()).find("tags.tif: "), std::string::npos) << e.what();
        EXPECT_NE(std::string(e.what()).find("second-order"), std::string::npos) << e.what();
    }
    psTruth->adfPixelAdjust[3] = 0.0;
    EXPECT_LT(LargestGdalDifference(osPath, *psTruth), 1e-6);
    psTruth->nAdjust = 0;

    // Through a link: the image it points at gets the polynomials, the link
    // stays a link, and no working copy is left beside either.
    const std::string osLink = Path("link.tif");
    std::filesystem::create_symlink(WriteImage("linked.tif"), osLink);
    lumo::gdal::AttachRPC(osLink, *psTruth);
    EXPECT_TRUE(std::filesystem::is_symlink(osLink));
    EXPECT_LT(LargestGdalDifference(Path("linked.tif"), *psTruth), 1e-6);
    for (const auto& oEntry : std::filesystem::directory_iterator(Path(""))) {
        EXPECT_EQ(oEntry.path().filename().string().find(".tmp"), std::string::npos)
            << oEntry.path();
    }

    // Files that are not GeoTIFFs.
    RasterSpec sPng;
    sPng.nCols = sPng.nRows = 8;
    sPng.eType = GDT_Byte;
    sPng.osDriver = "BMP";
    sPng.osSRS.clear();
    sPng.bGeoreferenced = false;
    lumo::support::WriteRaster(Path("image.bmp"), sPng, [](int, int, int) { return 1; });
    try {
        lumo::gdal::AttachRPC(Path("image.bmp"), *psTruth);
        ADD_FAILURE() << "attached to a BMP";
    } catch (const nova::DataException& e) {
        EXPECT_NE(std::string(e.what()).find("image.bmp"), std::string::npos) << e.what();
    }
}

TEST_F(ImageFileTest, ControlPointsAndGeoreferencingComeBackAndInfoShowsThem) {
    const std::string osPath = WriteImage("gcps.tif");
    GDALDatasetH hDs = GDALOpen(osPath.c_str(), GA_Update);
    GDAL_GCP asGCPs[3];
    GDALInitGCPs(3, asGCPs);
    const double adfValues[3][5] = {{1.5, 2.5, 500100.0, 5000200.0, 120.0},
                                    {60.0, 3.0, 500700.0, 5000180.0, 130.0},
                                    {30.0, 45.0, 500400.0, 4999700.0, 125.0}};
    for (int i = 0; i < 3; ++i) {
        asGCPs[i].dfGCPPixel = adfValues[i][0];
        asGCPs[i].dfGCPLine = adfValues[i][1];
        asGCPs[i].dfGCPX = adfValues[i][2];
        asGCPs[i].dfGCPY = adfValues[i][3];
        asGCPs[i].dfGCPZ = adfValues[i][4];
    }
    OGRSpatialReferenceH hSRS = OSRNewSpatialReference(nullptr);
    OSRImportFromEPSG(hSRS, 32631);
    GDALSetGCPs2(hDs, 3, asGCPs, hSRS);
    OSRDestroySpatialReference(hSRS);
    GDALDeinitGCPs(3, asGCPs);
    GDALClose(hDs);

    const lumo::gdal::ImageInfo sInfo = lumo::gdal::ReadImageInfo(osPath);
    EXPECT_EQ(sInfo.nPixels, 64);
    EXPECT_EQ(sInfo.nLines, 48);
    ASSERT_EQ(sInfo.asGCPs.size(), 3u);
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(sInfo.asGCPs[i].dfPixel, adfValues[i][0]);
        EXPECT_EQ(sInfo.asGCPs[i].dfY, adfValues[i][3]);
        EXPECT_EQ(sInfo.asGCPs[i].dfZ, adfValues[i][4]);
    }
    const lumo::support::RunResult sRun = lumo::support::RunTool({"info", osPath});
    EXPECT_EQ(sRun.nCode, 0) << sRun.osErr;
    EXPECT_NE(sRun.osOut.find("64 x 48 pixels"), std::string::npos) << sRun.osOut;
    EXPECT_NE(sRun.osOut.find("gcps: 3 in WGS 84 / UTM zone 31N"), std::string::npos) << sRun.osOut;
    EXPECT_NE(sRun.osOut.find("rpc: none"), std::string::npos) << sRun.osOut;

    // The stored points fit a model in their own CRS, over the image's size.
    const lumo::support::RunResult sFit = lumo::support::RunTool(
        {"fit", "--model", "poly", "--gcps", osPath, "-o", Path("poly.json")});
    EXPECT_EQ(sFit.nCode, 0) << sFit.osErr;
    const std::string osModel = lumo::support::ReadText(Path("poly.json"));
    EXPECT_NE(osModel.find("\"UTM 31 D000\""), std::string::npos) << osModel;
    EXPECT_NE(osModel.find("\"pixels\": 64"), std::string::npos) << osModel;

    const lumo::support::RunResult sBad = lumo::support::RunTool({"info", Path("none.tif")});
    EXPECT_EQ(sBad.nCode, 1);
    EXPECT_NE(sBad.osErr.find("none.tif: no such file"), std::string::npos) << sBad.osErr;
}

}  // namespace
