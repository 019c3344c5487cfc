// Host elevation models: the global geoid model against PROJ's own geoid
// conversion, gridded models against planes they must reproduce exactly,
// voids, coverage, the geoid fallback, the factory and concurrent readers.

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "crs.h"
#include "dem.h"
#include "runtime.h"

namespace {

using nova::dem::DEMFactory;
using nova::dem::DEMPtr;
using nova::dem::GridLayout;
using nova::ogc::CRSPtr;
namespace utils = nova::ogc::utils;

CRSPtr MakeCRS(const char* pszDefinition, nova::ogc::cs::DatumType eVertical) {
    CRSPtr poHorizontal(utils::CreateCRSFromDefinition(pszDefinition));
    return CRSPtr(utils::CreateCompoundCS(poHorizontal.get(), eVertical));
}

// Heights of the plane 100 + 0.5 col - 0.25 row, NaN in the voids given.
struct PlaneGrid {
    GridLayout sLayout;
    std::vector<std::pair<int, int>> aVoids;

    static double Height(double dfCol, double dfRow) { return 100.0 + 0.5 * dfCol - 0.25 * dfRow; }

    DEMPtr Make(nova::ogc::cs::DatumType eVertical, std::size_t nCacheBytes) const {
        const auto aVoidCopy = aVoids;
        auto fnRead = [aVoidCopy](int nCol0, int nRow0, int nCols, int nRows, float* pafOut) {
            for (int r = 0; r < nRows; ++r)
                for (int c = 0; c < nCols; ++c) {
                    const std::pair<int, int> oNode{nCol0 + c, nRow0 + r};
                    const bool bVoid =
                        std::find(aVoidCopy.begin(), aVoidCopy.end(), oNode) != aVoidCopy.end();
                    pafOut[r * nCols + c] =
                        bVoid ? std::nanf("") : static_cast<float>(Height(nCol0 + c, nRow0 + r));
                }
        };
        return DEMPtr(nova::dem::CreateGridDEM(MakeCRS("EPSG:32631", eVertical), sLayout, fnRead,
                                               nCacheBytes, "plane.tif"));
    }
};

// A UTM 31N grid of 600 x 500 nodes, 30 m apart, values standing for cells.
GridLayout UtmLayout() {
    GridLayout sLayout;
    sLayout.nCols = 600;
    sLayout.nRows = 500;
    sLayout.dfOriginX = 500015.0;
    sLayout.dfOriginY = 5000985.0;
    sLayout.dfStepX = 30.0;
    sLayout.dfStepY = -30.0;
    sLayout.sCoverage = {500000.0, 4986000.0, 518000.0, 5001000.0};
    return sLayout;
}

// Height at a (fractional) node of the UTM layout; NaN when there is none.
double HeightAtNode(const DEMPtr& poDem, double dfCol, double dfRow) {
    const GridLayout sL = UtmLayout();
    double dfH = 0.0;
    if (!poDem->GetHeight(sL.dfOriginX + dfCol * sL.dfStepX, sL.dfOriginY + dfRow * sL.dfStepY,
                          dfH)) {
        return std::nan("");
    }
    return dfH;
}

TEST(GlobalDEM, UndulationsMatchPROJsGeoidConversion) {
    DEMPtr poGeoid(DEMFactory::CreateGlobalDEM(true, 10));
    DEMPtr poSeaLevel(DEMFactory::CreateGlobalDEM(false, 10));
    ASSERT_TRUE(poGeoid && poSeaLevel);
    EXPECT_EQ(poGeoid->GetCRS()->GetVerticalDatumType(), nova::ogc::cs::CS_VD_Ellipsoidal);
    EXPECT_EQ(poSeaLevel->GetCRS()->GetVerticalDatumType(), nova::ogc::cs::CS_VD_Orthometric);
    // Mean sea level converted to ellipsoidal heights by PROJ is the undulation.
    nova::ogc::MathTransformPtr poToEllipsoid(
        utils::CreateCRSTransform(poSeaLevel->GetCRS(), poGeoid->GetCRS(), 0.0));
    ASSERT_TRUE(poToEllipsoid);
    std::mt19937 oRandom(7);
    std::uniform_real_distribution<double> oLon(-180.0, 180.0);
    std::uniform_real_distribution<double> oLat(-89.9, 89.9);
    std::vector<std::pair<double, double>> aPoints = {{179.99, 10.0}, {-180.0, -45.3}, {0.0, 0.0}};
    for (int i = 0; i < 300; ++i) aPoints.emplace_back(oLon(oRandom), oLat(oRandom));
    for (const auto& [dfLon, dfLat] : aPoints) {
        double dfSea = -1.0;
        ASSERT_TRUE(poSeaLevel->GetHeight(dfLon, dfLat, dfSea));
        EXPECT_EQ(dfSea, 0.0);
        double dfX = 0.0, dfY = 0.0, dfN = 0.0, dfOurs = 0.0;
        ASSERT_TRUE(poToEllipsoid->TransformPoint(dfLon, dfLat, 0.0, dfX, dfY, dfN));
        ASSERT_TRUE(poGeoid->GetHeight(dfLon, dfLat, dfOurs));
        EXPECT_NEAR(dfOurs, dfN, 1e-3) << dfLon << " " << dfLat;
    }
    double dfH = 0.0;
    EXPECT_FALSE(poGeoid->GetHeight(10.0, 91.0, dfH));
    EXPECT_FALSE(poSeaLevel->GetHeight(NAN, 0.0, dfH));
    EXPECT_THROW(DEMFactory::CreateGlobalDEM(true, 0), nova::ParameterException);
}

TEST(GridDEM, ReproducesPlanesAcrossTilesAndSkipsVoids) {
    PlaneGrid oPlane{UtmLayout(), {{300, 200}}};
    // A cache of one tile's worth still answers correctly.
    DEMPtr poDem = oPlane.Make(nova::ogc::cs::CS_VD_Orthometric, 1);
    for (double dfCol : {0.0, 17.3, 255.5, 256.0, 511.9, 599.0}) {
        for (double dfRow : {0.0, 3.7, 255.2, 499.0}) {
            EXPECT_NEAR(HeightAtNode(poDem, dfCol, dfRow), PlaneGrid::Height(dfCol, dfRow), 1e-3);
        }
    }
    // The outer half cell takes the edge nodes' heights.
    EXPECT_NEAR(HeightAtNode(poDem, -0.47, -0.47), PlaneGrid::Height(0, 0), 1e-3);
    // Beside the void the other three nodes carry the plane, each with its
    // bilinear weight (a point off the cell's centre tells the weights apart).
    const double dfExpected =
        (0.0625 * PlaneGrid::Height(301, 200) + 0.5625 * PlaneGrid::Height(300, 201) +
         0.1875 * PlaneGrid::Height(301, 201)) /
        0.8125;
    EXPECT_NEAR(HeightAtNode(poDem, 300.25, 200.75), dfExpected, 1e-3);
    EXPECT_TRUE(std::isnan(HeightAtNode(poDem, 300.0, 200.0)));
    // The array form: the void node, a point outside and the point beside it.
    std::vector<double> adfX = {509015.0, 400000.0, 509022.5};
    std::vector<double> adfY = {4994985.0, 5000000.0, 4994962.5}, adfH(3);
    EXPECT_EQ(poDem->GetHeights(3, adfX.data(), adfY.data(), adfH.data()), 1);
    EXPECT_EQ(adfH[0], nova::dem::kNoHeight);
    EXPECT_EQ(adfH[1], nova::dem::kNoHeight);
    EXPECT_NEAR(adfH[2], dfExpected, 1e-3);
}

TEST(GridDEM, ConcurrentReadersAgree) {
    DEMPtr poDem = PlaneGrid{UtmLayout(), {}}.Make(nova::ogc::cs::CS_VD_Orthometric, 8 << 20);
    std::vector<std::thread> aoThreads;
    std::vector<double> adfWorst(4, 0.0);
    for (int t = 0; t < 4; ++t) {
        aoThreads.emplace_back([&, t] {
            std::mt19937 oRandom(t);
            std::uniform_real_distribution<double> oCol(0.0, 599.0), oRow(0.0, 499.0);
            for (int i = 0; i < 20000; ++i) {
                const double dfCol = oCol(oRandom), dfRow = oRow(oRandom);
                adfWorst[t] = std::max(adfWorst[t], std::fabs(HeightAtNode(poDem, dfCol, dfRow) -
                                                              PlaneGrid::Height(dfCol, dfRow)));
            }
        });
    }
    for (auto& oThread : aoThreads) oThread.join();
    for (double dfWorst : adfWorst) EXPECT_LT(dfWorst, 1e-3);
}

TEST(GridDEM, GeoidFallbackOutsideCoverageWarnsOnce) {
    const double dfFarX = 530000.0, dfFarY = 5020000.0;
    for (auto eVertical : {nova::ogc::cs::CS_VD_Orthometric, nova::ogc::cs::CS_VD_Ellipsoidal}) {
        DEMPtr poDem(nova::dem::WithGeoidFallback(PlaneGrid{UtmLayout(), {}}.Make(eVertical, 0)));
        nova::ResetWarningCount();
        double dfInside = 0.0, dfOutside = 0.0, dfAgain = 0.0;
        ASSERT_TRUE(poDem->GetHeight(500015.0, 5000985.0, dfInside));
        EXPECT_NEAR(dfInside, 100.0, 1e-3);
        EXPECT_EQ(nova::GetWarningCount(), 0u);
        ASSERT_TRUE(poDem->GetHeight(dfFarX, dfFarY, dfOutside));
        ASSERT_TRUE(poDem->GetHeight(dfFarX + 100.0, dfFarY, dfAgain));
        EXPECT_EQ(nova::GetWarningCount(), 1u);
        EXPECT_NE(nova::GetLastErrorReport().osText.find("plane.tif"), std::string::npos);
        if (eVertical == nova::ogc::cs::CS_VD_Orthometric) {
            EXPECT_EQ(dfOutside, 0.0);
        } else {
            // The undulation where the UTM point lies, from the global model.
            DEMPtr poGeoid(DEMFactory::CreateGlobalDEM(true, 10));
            CRSPtr poUtm = MakeCRS("EPSG:32631", eVertical);
            nova::ogc::MathTransformPtr poToGeo(
                utils::CreateCRSTransform(poUtm.get(), poGeoid->GetCRS(), 0.0));
            double dfLon = 0.0, dfLat = 0.0, dfZ = 0.0, dfN = 0.0;
            ASSERT_TRUE(poToGeo->TransformPoint(dfFarX, dfFarY, 0.0, dfLon, dfLat, dfZ));
            ASSERT_TRUE(poGeoid->GetHeight(dfLon, dfLat, dfN));
            EXPECT_NEAR(dfOutside, dfN, 1e-6);
            EXPECT_GT(dfN, 40.0);  // about 48 m in central Europe
        }
    }
}

TEST(DEMFactory, OpensByKindAndNamesWhatItCannotRead) {
    DEMPtr poGeoid(DEMFactory::CreateDEM("geoid", 4));
    ASSERT_TRUE(poGeoid);
    EXPECT_EQ(poGeoid->GetDescription(), "EGM96 geoid");
    int nCalls = 0;
    DEMFactory::RegisterKind("test-plane", [&nCalls](const std::string& osSource, int) {
        ++nCalls;
        if (osSource != "plane") return static_cast<nova::dem::IRasterDEM*>(nullptr);
        return PlaneGrid{UtmLayout(), {}}.Make(nova::ogc::cs::CS_VD_Orthometric, 0).release();
    });
    EXPECT_EQ(DEMFactory::GetKinds().front(), "geoid");
    DEMPtr poPlane(DEMFactory::CreateDEM("test-plane:plane", 4));
    EXPECT_EQ(poPlane->GetDescription(), "plane.tif");
    try {
        DEMPtr poNone(DEMFactory::CreateDEM("/no/such/dem.tif", 4));
        FAIL() << "opened a missing source";
    } catch (const nova::ParameterException& e) {
        EXPECT_NE(std::string(e.what()).find("/no/such/dem.tif"), std::string::npos);
        EXPECT_NE(std::string(e.what()).find("test-plane"), std::string::npos);
    }
    EXPECT_EQ(nCalls, 2);
    EXPECT_THROW(DEMFactory::RegisterKind("a:b", nullptr), nova::ParameterException);
    GridLayout sBad = UtmLayout();
    sBad.dfStepX = 0.0;
    const PlaneGrid oBad{sBad, {}};
    EXPECT_THROW(oBad.Make(nova::ogc::cs::CS_VD_Orthometric, 0), nova::ParameterException);
}

}  // namespace
