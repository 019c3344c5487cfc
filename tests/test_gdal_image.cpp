// Models from image files: rational polynomials read from every carrier GDAL
// knows agree with the text they came from and with what GDAL's own RPC
// transformer evaluates; control points and georeferencing come back as
// stored; `lumo info` shows them.

#include <gtest/gtest.h>

#include <array>
#include <cmath>
#include <filesystem>
#include <string>
#include <vector>

#include "lumo.h"
#include "lumo_gdal.h"
#include "rf_io.h"
#include "runtime.h"
#include "support/cli_runner.h"
#include "support/gdal_rasters.h"
#include "support/numbered_error.h"

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
        lumo::support::WriteRaster(Path(osName), lumo::support::PlainImage(64, 48),
                                   [](int, int c, int) { return c; });
        return Path(osName);
    }
};

using lumo::support::GdalRpcDisagreement;
using lumo::support::ImagePoint;

// Ground points over the record's cube at three heights, with their image
// positions by the record.
std::vector<ImagePoint> CubePoints(RFInfo_t& sRF) {
    std::vector<ImagePoint> aPoints;
    for (int i = -4; i <= 4; ++i) {
        for (int j = -4; j <= 4; ++j) {
            for (double dfW : {-1.0, 0.0, 1.0}) {
                ImagePoint a{sRF.dfXOffset + 0.2 * i * sRF.dfXScale,
                             sRF.dfYOffset + 0.2 * j * sRF.dfYScale,
                             sRF.dfZOffset + dfW * sRF.dfZScale, 0.0, 0.0};
                RFGeo2Img(&sRF, a[0], a[1], a[2], &a[3], &a[4]);
                aPoints.push_back(a);
            }
        }
    }
    return aPoints;
}

double LargestImageDifference(RFInfo_t& sA, RFInfo_t& sB) {
    double dfWorst = 0.0;
    for (const ImagePoint& a : CubePoints(sA)) {
        double dfPixel = 0, dfLine = 0;
        RFGeo2Img(&sB, a[0], a[1], a[2], &dfPixel, &dfLine);
        dfWorst = std::max(dfWorst, std::hypot(dfPixel - a[3], dfLine - a[4]));
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
        EXPECT_LT(GdalRpcDisagreement(Path(pszName), CubePoints(*psTruth)), 1e-6) << pszName;
        EXPECT_TRUE(lumo::gdal::ReadImageInfo(Path(pszName)).bHasRPC) << pszName;
    }
    EXPECT_FALSE(lumo::gdal::ReadImageInfo(WriteImage("plain.tif")).bHasRPC);
}

TEST_F(ImageFileTest, AttachedPolynomialsFoldTheAdjustmentAndFollowLinks) {
    RFPtr psTruth = SceneModel();
    const std::string osPath = WriteImage("tags.tif");
    // An image-space scale and shift in force is folded into the attached
    // polynomials, as in the text forms; a second-order one has no
    // equivalent and is refused, naming why, leaving the file as it was.
    psTruth->nAdjust = 1;
    psTruth->adfPixelAdjust[0] = 1.5;
    psTruth->adfPixelAdjust[1] = 1e-4;
    psTruth->adfLineAdjust[0] = -0.75;
    psTruth->adfLineAdjust[2] = -2e-4;
    lumo::gdal::AttachRPC(osPath, *psTruth);
    EXPECT_LT(GdalRpcDisagreement(osPath, CubePoints(*psTruth)), 1e-6);
    psTruth->adfPixelAdjust[3] = 1e-9;
    const std::string osSecond =
        lumo::support::DataErrorOf([&] { lumo::gdal::AttachRPC(osPath, *psTruth); });
    EXPECT_TRUE(lumo::support::Names(osSecond, {"tags.tif: ", "second-order"})) << osSecond;
    psTruth->adfPixelAdjust[3] = 0.0;
    EXPECT_LT(GdalRpcDisagreement(osPath, CubePoints(*psTruth)), 1e-6);
    psTruth->nAdjust = 0;

    // Through a link: the image it points at gets the polynomials, the link
    // stays a link, and no working copy is left beside either.
    const std::string osLink = Path("link.tif");
    std::filesystem::create_symlink(WriteImage("linked.tif"), osLink);
    lumo::gdal::AttachRPC(osLink, *psTruth);
    EXPECT_TRUE(std::filesystem::is_symlink(osLink));
    EXPECT_LT(GdalRpcDisagreement(Path("linked.tif"), CubePoints(*psTruth)), 1e-6);
    for (const auto& oEntry : std::filesystem::directory_iterator(Path(""))) {
        EXPECT_EQ(oEntry.path().filename().string().find(".tmp"), std::string::npos)
            << oEntry.path();
    }

    // Files that are not GeoTIFFs.
    RasterSpec sBmp = lumo::support::PlainImage(8, 8, 1, GDT_Byte);
    sBmp.osDriver = "BMP";
    lumo::support::WriteRaster(Path("image.bmp"), sBmp, [](int, int, int) { return 1; });
    const std::string osBmp =
        lumo::support::DataErrorOf([&] { lumo::gdal::AttachRPC(Path("image.bmp"), *psTruth); });
    EXPECT_NE(osBmp.find("image.bmp"), std::string::npos) << osBmp;
}

TEST_F(ImageFileTest, ControlPointsAndGeoreferencingComeBackAndInfoShowsThem) {
    const std::string osPath = WriteImage("gcps.tif");
    GDALDatasetH hDs = GDALOpen(osPath.c_str(), GA_Update);
    char szNone[] = "";
    GDAL_GCP asGCPs[3] = {{szNone, szNone, 1.5, 2.5, 500100.0, 5000200.0, 120.0},
                          {szNone, szNone, 60.0, 3.0, 500700.0, 5000180.0, 130.0},
                          {szNone, szNone, 30.0, 45.0, 500400.0, 4999700.0, 125.0}};
    OGRSpatialReferenceH hSRS = OSRNewSpatialReference(nullptr);
    OSRImportFromEPSG(hSRS, 32631);
    GDALSetGCPs2(hDs, 3, asGCPs, hSRS);
    OSRDestroySpatialReference(hSRS);
    GDALClose(hDs);

    const lumo::gdal::ImageInfo sInfo = lumo::gdal::ReadImageInfo(osPath);
    EXPECT_EQ(sInfo.nPixels, 64);
    EXPECT_EQ(sInfo.nLines, 48);
    ASSERT_EQ(sInfo.asGCPs.size(), 3u);
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(sInfo.asGCPs[i].dfPixel, asGCPs[i].dfGCPPixel);
        EXPECT_EQ(sInfo.asGCPs[i].dfY, asGCPs[i].dfGCPY);
        EXPECT_EQ(sInfo.asGCPs[i].dfZ, asGCPs[i].dfGCPZ);
    }
    const lumo::support::RunResult sRun = lumo::support::RunTool({"info", osPath});
    EXPECT_EQ(sRun.nCode, 0) << sRun.osErr;
    EXPECT_TRUE(lumo::support::Names(
        sRun.osOut, {"64 x 48 pixels", "gcps: 3 in WGS 84 / UTM zone 31N", "rpc: none"}))
        << sRun.osOut;

    // The stored points fit a model in their own CRS, over the image's size.
    const lumo::support::RunResult sFit = lumo::support::RunTool(
        {"fit", "--model", "poly", "--gcps", osPath, "-o", Path("poly.json")});
    EXPECT_EQ(sFit.nCode, 0) << sFit.osErr;
    const std::string osModel = lumo::support::ReadText(Path("poly.json"));
    EXPECT_TRUE(lumo::support::Names(osModel, {"\"UTM 31 D000\"", "\"pixels\": 64"})) << osModel;

    const lumo::support::RunResult sBad = lumo::support::RunTool({"info", Path("none.tif")});
    EXPECT_EQ(sBad.nCode, 1);
    EXPECT_NE(sBad.osErr.find("none.tif: no such file"), std::string::npos) << sBad.osErr;
}

}  // namespace
