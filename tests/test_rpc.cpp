// Host rational polynomial models: the fit recovers a known model exactly
// and approximates a smooth one closely, the Newton inverse round-trips and
// fails cleanly outside the domain, scenes across the 180th meridian fit as
// well as any other, and bad input is refused.
#include <gtest/gtest.h>

#include <cmath>
#include <memory>
#include <random>
#include <vector>

#include "crs.h"
#include "rpc.h"
#include "runtime.h"

namespace {

using nova::mathmodel::RpcCoefCalculator;
using nova::mathmodel::RpcCoefficients;
using nova::mathmodel::RpcMathModel;

struct Samples {
    std::vector<double> lat, lon, h, line, pixel;
};

// A smooth, non-rational image function of a scene centred on (lon0, lat0):
// a slightly rotated, curved raster with height parallax.
void SmoothImage(double lon, double lat, double h, double lon0, double lat0, double& pixel,
                 double& line) {
    const double e = std::remainder(lon - lon0, 360.0) * 111320.0 * std::cos(lat0 * 0.0174533);
    const double n = (lat - lat0) * 110540.0;
    pixel = 4000.0 + (0.98 * e + 0.17 * n) / 12.5 + 2e-9 * e * e - h * 0.2 +
            3e-5 * h * std::sin(e / 40000.0);
    line = 5000.0 + (-0.17 * e + 0.98 * n) / 12.5 + 1e-9 * n * e + 1e-6 * h * n / 1000.0;
}

Samples Grid(double lon0, double lat0, double dLon, double dLat, int nHeights) {
    Samples s;
    for (int i = 0; i < 30; ++i) {
        for (int j = 0; j < 30; ++j) {
            for (int k = 0; k < nHeights; ++k) {
                const double lat = lat0 - dLat + 2 * dLat * i / 29.0;
                const double lon = std::remainder(lon0 - dLon + 2 * dLon * j / 29.0, 360.0);
                const double h = nHeights == 1 ? 300.0 : -500.0 + 8500.0 * k / (nHeights - 1);
                double p, l;
                SmoothImage(lon, lat, h, lon0, lat0, p, l);
                s.lat.push_back(lat);
                s.lon.push_back(lon);
                s.h.push_back(h);
                s.pixel.push_back(p);
                s.line.push_back(l);
            }
        }
    }
    return s;
}

std::unique_ptr<RpcMathModel> Fit(const Samples& s, const nova::ogc::cs::ICRS* poCRS = nullptr) {
    RpcCoefCalculator calc;
    calc.SetReportingFlag(false);
    RpcMathModel* poModel = nullptr;
    EXPECT_EQ(calc.CalcCoef(s.lat, s.lon, s.h, s.line, s.pixel, poCRS, poModel), 0)
        << calc.GetLastError();
    return std::unique_ptr<RpcMathModel>(poModel);
}

// Largest image error of the model against the smooth function at random
// points of the fitted box.
double CheckError(const RpcMathModel& m, double lon0, double lat0, double dLon, double dLat) {
    std::mt19937 rng(11);
    std::uniform_real_distribution<double> u(-1.0, 1.0), hh(-500.0, 8000.0);
    double worst = 0.0;
    for (int i = 0; i < 2000; ++i) {
        const double lon = lon0 + dLon * u(rng), lat = lat0 + dLat * u(rng), h = hh(rng);
        double p, l, tp, tl;
        EXPECT_EQ(m.GroundToImage(lon, lat, h, p, l, false), 0);
        SmoothImage(lon, lat, h, lon0, lat0, tp, tl);
        worst = std::max({worst, std::fabs(p - tp), std::fabs(l - tl)});
    }
    return worst;
}

// Scenes with relief, across the 180th meridian and on one plane (a model
// free of height): each fits its image function to a hundredth of a pixel,
// ground -> image -> ground -> image closes over the scene's box, with
// longitudes coming back in [-180, 180], and points outside it fail.
TEST(Rpc, FitsSmoothScenesAndRoundTrips) {
    const struct {
        double lon0, lat0, dLon, dLat;
        int nHeights;
    } aScenes[] = {
        {10.0, 45.0, 0.6, 0.45, 8}, {179.8, 60.0, 0.6, 0.3, 8}, {10.0, 45.0, 0.6, 0.45, 1}};
    for (const auto& sc : aScenes) {
        SCOPED_TRACE(testing::Message() << sc.lon0 << " " << sc.lat0 << " " << sc.nHeights);
        std::unique_ptr<RpcMathModel> m =
            Fit(Grid(sc.lon0, sc.lat0, sc.dLon, sc.dLat, sc.nHeights));
        ASSERT_TRUE(m);
        EXPECT_LT(m->GetFitReport().dfMaxPixel, 0.01);
        EXPECT_LT(m->GetFitReport().dfMaxLine, 0.01);
        if (sc.nHeights > 1) {
            EXPECT_LT(CheckError(*m, sc.lon0, sc.lat0, sc.dLon, sc.dLat), 0.01);
        }
        std::mt19937 rng(5);
        std::uniform_real_distribution<double> u(-1.0, 1.0), hh(0.0, 3000.0);
        for (int i = 0; i < 500; ++i) {
            const double lon0 = sc.lon0 + sc.dLon * u(rng), lat0 = sc.lat0 + sc.dLat * u(rng);
            const double h = sc.nHeights > 1 ? hh(rng) : 300.0;
            double p, l, lon, lat, p2, l2;
            ASSERT_EQ(m->GroundToImage(lon0, lat0, h, p, l, false), 0);
            ASSERT_EQ(m->ImageToGround(p, l, h, lon, lat, false), 0) << p << " " << l;
            EXPECT_NEAR(std::remainder(lon - lon0, 360.0), 0.0, 1e-9);
            EXPECT_LE(std::fabs(lon), 180.0);
            EXPECT_NEAR(lat, lat0, 1e-9);
            ASSERT_EQ(m->GroundToImage(lon, lat, h, p2, l2, false), 0);
            EXPECT_NEAR(p2, p, 1e-6);
            EXPECT_NEAR(l2, l, 1e-6);
        }
        // Outside the fitted box both directions fail with the null value.
        double p = 0, l = 0, x = 0, y = 0;
        EXPECT_EQ(m->GroundToImage(sc.lon0 + 5.0 * sc.dLon, sc.lat0, 300.0, p, l, false), -1);
        EXPECT_EQ(p, -1e20);
        EXPECT_EQ(m->GroundToImage(sc.lon0, sc.lat0, 20000.0, p, l, false), -1);
        EXPECT_EQ(m->GroundToImage(sc.lon0, std::nan(""), 300.0, p, l, false), -1);
        EXPECT_EQ(m->ImageToGround(1e6, 1e6, 300.0, x, y, false), -1);
        EXPECT_EQ(x, -1e20);
    }
}

TEST(Rpc, BadInputIsRefused) {
    Samples s = Grid(10.0, 45.0, 0.6, 0.45, 2);
    RpcCoefCalculator calc;
    calc.SetReportingFlag(false);
    RpcMathModel* m = reinterpret_cast<RpcMathModel*>(&calc);  // must be reset to null
    std::vector<double> shorter(s.lat.begin(), s.lat.end() - 1);
    EXPECT_EQ(calc.CalcCoef(shorter, s.lon, s.h, s.line, s.pixel, nullptr, m), -1);
    EXPECT_EQ(m, nullptr);
    EXPECT_NE(calc.GetLastError(), "");
    std::vector<double> few(38, 1.0);
    EXPECT_EQ(calc.CalcCoef(few, few, few, few, few, nullptr, m), -1);
    s.h[17] = std::nan("");
    EXPECT_EQ(calc.CalcCoef(s.lat, s.lon, s.h, s.line, s.pixel, nullptr, m), -1);
    EXPECT_NE(calc.GetLastError().find("not finite"), std::string::npos);

    RpcCoefficients c;
    c.adfLineDen[0] = c.adfPixelDen[0] = 1.0;
    c.dfLatScale = 0.0;
    EXPECT_THROW(RpcMathModel(c, nullptr), nova::ParameterException);
    c.dfLatScale = 1.0;
    c.adfPixelNum[4] = std::nan("");
    EXPECT_THROW(RpcMathModel(c, nullptr), nova::ParameterException);
}

TEST(Rpc, CopiesAreIndependentAndEqual) {
    nova::ogc::CRSPtr wgs84(
        nova::ogc::ProjectionEngine::GetCSAuthorityFactory(3)->CreateWGS84Ellipsoidal());
    std::unique_ptr<RpcMathModel> m = Fit(Grid(10.0, 45.0, 0.6, 0.45, 4), wgs84.get());
    m->SetRasterDimensions(8000, 10000);
    wgs84.reset();  // the model keeps its own copy
    std::unique_ptr<nova::mathmodel::IMathModel> copy(m->Clone());
    EXPECT_TRUE(m->IsEqual(copy.get()));
    EXPECT_EQ(copy->GetNumColumns(), 8000);
    EXPECT_EQ(copy->GetNumRows(), 10000);
    ASSERT_NE(copy->GetCRS(), nullptr);
    EXPECT_TRUE(copy->GetCRS()->IsGeographic());
    m->SetRasterDimensions(1, 1);
    EXPECT_FALSE(m->IsEqual(copy.get()));
    EXPECT_EQ(copy->GetModelType(), nova::mathmodel::MM_TYPE_RPC);
}

}  // namespace
