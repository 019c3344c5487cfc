// Elevation files through GDAL: planes reproduced exactly at cell centres,
// stored scale and nodata, the declared vertical datum, the geoid
// fallback, the factory kind, concurrent readers and every refusal.

#include <gtest/gtest.h>

#include <cmath>
#include <string>
#include <thread>
#include <vector>

#include "lumo_gdal.h"
#include "runtime.h"
#include "support/cli_runner.h"
#include "support/gdal_rasters.h"
#include "support/numbered_error.h"

namespace {

using lumo::gdal::FileDEMOptions;
using lumo::gdal::HeightReference;
using lumo::support::RasterSpec;
using nova::dem::DEMPtr;

// A plane over UTM 31N: height at ground (x, y).
double Plane(double dfX, double dfY) {
    return 250.0 + 0.01 * (dfX - 500000.0) - 0.02 * (dfY - 5000000.0);
}

// 30 m cells from (500000, 5006000) eastwards and southwards.
RasterSpec PlaneSpec(int nCols, int nRows) {
    return lumo::support::NorthUpGrid(nCols, nRows, "EPSG:32631", 500000.0, 5006000.0, 30.0);
}

class GdalDemTest : public lumo::support::ScratchDirTest {
  protected:
    GdalDemTest() : ScratchDirTest("lumo_gdal_dem_") {}

    // Writes the plane sampled at cell centres, with one void.
    std::string WritePlane(const std::string& osName, const RasterSpec& sSpec) {
        const std::string osPath = Path(osName);
        const double* gt = sSpec.adfGeoTransform;
        lumo::support::WriteRaster(osPath, sSpec, [&](int, int c, int r) {
            if (c == 10 && r == 10 && sSpec.bHasNoData) return sSpec.dfNoData;
            return Plane(gt[0] + (c + 0.5) * gt[1], gt[3] + (r + 0.5) * gt[5]);
        });
        return osPath;
    }
};

TEST_F(GdalDemTest, ReproducesPlanesAndSkipsVoids) {
    RasterSpec sSpec = PlaneSpec(300, 200);
    sSpec.bHasNoData = true;
    sSpec.dfNoData = -9999.0;
    FileDEMOptions sOptions;
    sOptions.bGeoidFallback = false;
    DEMPtr poDem(lumo::gdal::OpenFileDEM(WritePlane("plane.tif", sSpec), sOptions));
    EXPECT_EQ(poDem->GetCRS()->GetVerticalDatumType(), nova::ogc::cs::CS_VD_Orthometric);
    for (double dfX : {500020.0, 503333.3, 504499.0, 504511.0, 508980.0}) {
        for (double dfY : {5005980.0, 5003001.7, 5000020.0}) {
            double dfH = 0.0;
            ASSERT_TRUE(poDem->GetHeight(dfX, dfY, dfH)) << dfX;
            EXPECT_NEAR(dfH, Plane(dfX, dfY), 2e-3) << dfX << " " << dfY;
        }
    }
    double dfOut = 0.0;
    EXPECT_FALSE(poDem->GetHeight(499990.0, 5003000.0, dfOut));
    // The void has no height at its own cell centre.
    EXPECT_FALSE(poDem->GetHeight(500000.0 + 10.5 * 30, 5006000.0 - 10.5 * 30, dfOut));
}

TEST_F(GdalDemTest, DecodesScaledIntegersAndDeclaredDatums) {
    RasterSpec sSpec = PlaneSpec(50, 40);
    sSpec.eType = GDT_Int16;
    sSpec.dfScale = 0.5;
    sSpec.dfOffset = 100.0;
    const std::string osPath = WritePlane("scaled.tif", sSpec);
    FileDEMOptions sOptions;
    sOptions.eHeights = HeightReference::kEllipsoid;
    DEMPtr poDem(lumo::gdal::OpenFileDEM(osPath, sOptions));
    EXPECT_EQ(poDem->GetCRS()->GetVerticalDatumType(), nova::ogc::cs::CS_VD_Ellipsoidal);
    double dfH = 0.0;
    const double dfX = 500000.0 + 20.5 * 30, dfY = 5006000.0 - 7.5 * 30;
    ASSERT_TRUE(poDem->GetHeight(dfX, dfY, dfH));
    EXPECT_DOUBLE_EQ(dfH, std::round(Plane(dfX, dfY)) * 0.5 + 100.0);

    // Outside the file the geoid fallback answers (its values and warning are
    // the elevation grid's, tested with it): the undulation above the ellipsoid.
    double dfFar = 0.0;
    ASSERT_TRUE(poDem->GetHeight(600000.0, 5100000.0, dfFar));
    EXPECT_GT(dfFar, 40.0);

    // The factory opens the file as kind "gdal", with or without the prefix.
    lumo::gdal::Initialize();
    DEMPtr poByKind(nova::dem::DEMFactory::CreateDEM("gdal:" + osPath, 16));
    DEMPtr poByProbe(nova::dem::DEMFactory::CreateDEM(osPath, 16));
    EXPECT_EQ(poByProbe->GetDescription(), osPath);
}

TEST_F(GdalDemTest, ConcurrentReadersAgree) {
    const std::string osPath = WritePlane("plane.tif", PlaneSpec(600, 600));
    FileDEMOptions sOptions;
    sOptions.nCacheMegabytes = 1;  // forces tiles to be read again and again
    DEMPtr poDem(lumo::gdal::OpenFileDEM(osPath, sOptions));
    std::vector<double> adfWorst(4, 0.0);
    std::vector<std::thread> aoThreads;
    for (int t = 0; t < 4; ++t) {
        aoThreads.emplace_back([&, t] {
            for (int i = 0; i < 4000; ++i) {
                const double dfX = 500020.0 + std::fmod(i * 97.0 + t * 1000.0, 17950.0);
                const double dfY = 5005980.0 - std::fmod(i * 53.0 + t * 700.0, 17950.0);
                double dfH = 0.0;
                poDem->GetHeight(dfX, dfY, dfH);
                adfWorst[t] = std::max(adfWorst[t], std::fabs(dfH - Plane(dfX, dfY)));
            }
        });
    }
    for (auto& oThread : aoThreads) oThread.join();
    for (double dfWorst : adfWorst) EXPECT_LT(dfWorst, 2e-3);
}

TEST_F(GdalDemTest, RefusesUnusableFilesNamingThem) {
    RasterSpec sNoCRS = PlaneSpec(10, 10);
    sNoCRS.osSRS.clear();
    RasterSpec sLocal = PlaneSpec(10, 10);
    sLocal.osSRS = "LOCAL_CS[\"site\",UNIT[\"metre\",1]]";
    const std::vector<std::pair<std::string, std::string>> aCases = {
        {Path("missing.tif"), "no such file"},
        {Write("text.tif", "not a raster"), "not a raster"},
        {WritePlane("nocrs.tif", sNoCRS), "no coordinate system"},
        {WritePlane("local.tif", sLocal), "neither geographic nor projected"},
    };
    for (const auto& [osPath, osWhat] : aCases) {
        const std::string osText = lumo::support::DataErrorOf(
            [&] { DEMPtr(lumo::gdal::OpenFileDEM(osPath, FileDEMOptions{})); });
        EXPECT_TRUE(lumo::support::Names(osText, {osPath, osWhat})) << osPath << ": " << osText;
    }
    FileDEMOptions sBand;
    sBand.nBand = 2;
    EXPECT_THROW(lumo::gdal::OpenFileDEM(WritePlane("one.tif", PlaneSpec(5, 5)), sBand),
                 nova::DataException);
}

}  // namespace
