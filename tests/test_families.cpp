// One property test for every model family, run on the bundled example
// model of each: image -> ground -> image and ground -> image -> ground close
// over a grid of the image at several heights, input that is not a number
// never comes back as a position reported as success, and the model object's
// array form gives exactly its point form.
#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <string>
#include <vector>

#include "lumo.h"
#include "model_io.h"

namespace {

struct Family {
    const char* pszFile;  // under examples/
    double dfImageTol;    // pixels, for image -> ground -> image
    double dfGroundTol;   // ground units, for ground -> image -> ground
    bool bHeightMatters;  // the family's ground position depends on Z
    bool bObject;         // the model object wraps the family
};

std::ostream& operator<<(std::ostream& os, const Family& f) {
    return os << f.pszFile;
}

class FamilyProperty : public testing::TestWithParam<Family> {};

// A position a failed call might leave: not finite, or the null value.
bool IsNoPosition(double a, double b) {
    return !std::isfinite(a) || !std::isfinite(b) || a == LUMO_NULL_VALUE || b == LUMO_NULL_VALUE;
}

TEST_P(FamilyProperty, RoundTripsFailureValuesAndArrayForm) {
    const Family& f = GetParam();
    const lumo::cli::LoadedModel m =
        lumo::cli::ReadModelFile(std::string(LUMO_SOURCE_DIR) + "/examples/" + f.pszFile);
    void* pv = m.poRecord.get();
    const int nCode = m.nModelCode;
    const double dfW = m.sEnvelope.nPixels, dfH = m.sEnvelope.nLines;
    ASSERT_GT(dfW, 0.0);

    // Round trips over a 9 x 9 grid of the image at three heights; the
    // ground positions of the grid's first row feed the array form below.
    std::vector<double> adfRowX;
    double dfRowY = 0.0;
    for (double dfZ : {0.0, 400.0, 1200.0}) {
        for (int i = 0; i <= 8; ++i) {
            for (int j = 0; j <= 8; ++j) {
                const double p = dfW * (0.05 + 0.9 * j / 8.0), l = dfH * (0.05 + 0.9 * i / 8.0);
                double X = 0, Y = 0, p2 = 0, l2 = 0, X2 = 0, Y2 = 0;
                ASSERT_EQ(GenImg2Geo(nCode, pv, p, l, dfZ, &X, &Y), 1) << p << " " << l;
                ASSERT_EQ(GenGeo2Img(nCode, pv, X, Y, dfZ, &p2, &l2), 1);
                EXPECT_NEAR(p2, p, f.dfImageTol) << "line " << l << " Z " << dfZ;
                EXPECT_NEAR(l2, l, f.dfImageTol) << "pixel " << p << " Z " << dfZ;
                ASSERT_EQ(GenImg2Geo(nCode, pv, p2, l2, dfZ, &X2, &Y2), 1);
                EXPECT_NEAR(X2, X, f.dfGroundTol);
                EXPECT_NEAR(Y2, Y, f.dfGroundTol);
                if (i == 4 && dfZ == 400.0) {
                    adfRowX.push_back(X);
                    dfRowY = Y;
                }
            }
        }
    }
    // The height moves the ground position of a pixel exactly when the
    // family models relief.
    double dfX0 = 0, dfY0 = 0, dfX1 = 0, dfY1 = 0;
    GenImg2Geo(nCode, pv, 0.2 * dfW, 0.3 * dfH, 0.0, &dfX0, &dfY0);
    GenImg2Geo(nCode, pv, 0.2 * dfW, 0.3 * dfH, 1000.0, &dfX1, &dfY1);
    EXPECT_EQ(std::hypot(dfX1 - dfX0, dfY1 - dfY0) > 1e-9, f.bHeightMatters);

    // Input that is not a number is never a position reported as success.
    const double dfNaN = std::numeric_limits<double>::quiet_NaN();
    const double dfInf = std::numeric_limits<double>::infinity();
    for (double dfBad : {dfNaN, dfInf, -dfInf}) {
        double a = 1, b = 2;
        const int nForward = GenGeo2Img(nCode, pv, dfBad, dfRowY, 0.0, &a, &b);
        EXPECT_TRUE(nForward == 0 || IsNoPosition(a, b)) << dfBad << " -> " << a << " " << b;
        a = 1, b = 2;
        const int nInverse = GenImg2Geo(nCode, pv, 0.5 * dfW, dfBad, 0.0, &a, &b);
        EXPECT_TRUE(nInverse == 0 || IsNoPosition(a, b)) << dfBad << " -> " << a << " " << b;
    }

    // The model object's array form is its point form, point by point.
    if (!f.bObject) return;
    const nova::mathmodel::LumoMathModel oModel(nCode, pv);
    const int n = static_cast<int>(adfRowX.size());
    std::vector<double> adfPixel(n), adfLine(n);
    std::vector<int> anValid(n, -1);
    EXPECT_EQ(oModel.GroundToImage(dfRowY, 400.0, n, adfRowX.data(), adfPixel.data(),
                                   adfLine.data(), anValid.data(), false),
              0);
    for (int k = 0; k < n; ++k) {
        double p = 0, l = 0;
        ASSERT_EQ(oModel.GroundToImage(adfRowX[k], dfRowY, 400.0, p, l, false), 0);
        EXPECT_EQ(anValid[k], 1);
        EXPECT_EQ(adfPixel[k], p);
        EXPECT_EQ(adfLine[k], l);
    }
}

INSTANTIATE_TEST_SUITE_P(Examples, FamilyProperty,
                         // The rigorous transforms are approximate inverses of each other (the
                         // exact inverse is SRITGeo2ImgExact): within a pixel.
                         testing::Values(Family{"poly_utm31.json", 0.05, 0.5, false, true},
                                         Family{"tps_utm31.json", 0.05, 0.5, false, true},
                                         Family{"rf_scene.json", 1e-6, 1e-9, true, false},
                                         Family{"ap_frame_utm31.json", 1e-4, 1e-3, true, false},
                                         Family{"srit_spot5_roll20.json", 1.0, 6.0, true, true},
                                         Family{"rtcs_scene.json", 1e-6, 1e-9, true, true},
                                         Family{"lrs_avhrr_pass.json", 0.01, 1e-4, true, true}));

}  // namespace
