// One property test for every model family, run on the bundled example
// model of each: image -> ground -> image and ground -> image -> ground close
// over a grid of the image at several heights, input that is not a number
// is a failed call, the dispatch ignores what the outputs held before, the
// model object's array form gives exactly its point form, an iterative inverse reports success only
// for points that project back onto the point asked for, and rational polynomials fitted to the
// model follow it.
#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <limits>
#include <random>
#include <string>
#include <vector>

#include "lumo.h"
#include "model_io.h"
#include "model_object.h"
#include "rpc_fit.h"

namespace {

const std::string kExamples = std::string(LUMO_SOURCE_DIR) + "/examples/";

struct Family {
    const char* pszFile;  // under examples/
    double dfImageTol;    // pixels, for image -> ground -> image
    double dfGroundTol;   // ground units, for ground -> image -> ground
    bool bHeightMatters;  // the family's ground position depends on Z
    bool bObject;         // the model object wraps the family
    bool bIterative;      // image -> ground is an iteration that may fail far out
    double dfRpcBound;    // pixels a fitted cubic ratio may stray on the check grid
};

std::ostream& operator<<(std::ostream& os, const Family& f) {
    return os << f.pszFile;
}

class FamilyProperty : public testing::TestWithParam<Family> {};

// A point of the space an inverse starts from, and its height.
struct Start {
    double a, b, z;
};

// The inverse maps (a, b) at height z to (c, d) and returns whether it
// succeeded; the forward maps (c, d, z) back to (a, b).
using Map = std::function<bool(double a, double b, double z, double* c, double* d)>;

// Draws points around `centre` at distances of `half` times 0.5 to 1e4, and
// heights from the model's range to 1e9 m; every success must project back
// within `tolerance`. Checks that some succeed and some (far out) fail.
void ExpectSuccessesProjectBack(const Start& centre, const Start& half, const Map& inverse,
                                const Map& forward, double tolerance) {
    std::mt19937 engine(20240611);
    std::uniform_real_distribution<double> unit(-1.0, 1.0);
    int successes = 0, total = 0;
    for (const double span : {0.5, 1.0, 3.0, 30.0, 1e4}) {
        for (const double heightSpan : {1.0, 10.0, 1e6}) {
            for (int i = 0; i < 200; ++i, ++total) {
                const Start s{centre.a + span * half.a * unit(engine),
                              centre.b + span * half.b * unit(engine),
                              centre.z + heightSpan * half.z * unit(engine)};
                double c = 0.0, d = 0.0, a = 0.0, b = 0.0;
                if (!inverse(s.a, s.b, s.z, &c, &d)) continue;
                ++successes;
                EXPECT_TRUE(forward(c, d, s.z, &a, &b)) << s.a << " " << s.b << " " << s.z;
                EXPECT_NEAR(a, s.a, tolerance) << s.a << " " << s.b << " " << s.z;
                EXPECT_NEAR(b, s.b, tolerance) << s.a << " " << s.b << " " << s.z;
            }
        }
    }
    EXPECT_GT(successes, 0.3 * total);  // the check is not vacuous
    EXPECT_LT(successes, total);        // and far points do fail
}

TEST_P(FamilyProperty, RoundTripsFailureValuesAndArrayForm) {
    const Family& f = GetParam();
    const lumo::cli::LoadedModel m = lumo::cli::ReadModelFile(kExamples + f.pszFile);
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
                // Outputs holding a wild value beforehand change nothing.
                X2 = -1e7, Y2 = 1e7;
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

    // Input that is not a number is a failed call, never a position.
    const double dfNaN = std::numeric_limits<double>::quiet_NaN();
    const double dfInf = std::numeric_limits<double>::infinity();
    for (double dfBad : {dfNaN, dfInf, -dfInf}) {
        double a = 1, b = 2;
        EXPECT_EQ(GenGeo2Img(nCode, pv, dfBad, dfRowY, 0.0, &a, &b), 0) << dfBad;
        EXPECT_EQ(GenImg2Geo(nCode, pv, 0.5 * dfW, dfBad, 0.0, &a, &b), 0) << dfBad;
    }

    // An iterative inverse is honest about the points it reports.
    if (f.bIterative) {
        const Map inverse = [&](double p, double l, double z, double* x, double* y) {
            return GenImg2Geo(nCode, pv, p, l, z, x, y) == 1;
        };
        const Map forward = [&](double x, double y, double z, double* p, double* l) {
            return GenGeo2Img(nCode, pv, x, y, z, p, l) == 1;
        };
        ExpectSuccessesProjectBack({dfW / 2, dfH / 2, 400.0}, {dfW / 2, dfH / 2, 400.0}, inverse,
                                   forward, 1e-3);
    }

    // Rational polynomials fitted to the model follow it on the independent
    // check grid within what the family's shape allows.
    const lumo::cli::RpcFit sFit = lumo::cli::FitRpcToModel(
        *lumo::cli::MakeModelObject(m), m.sEnvelope.nPixels, m.sEnvelope.nLines, 0.0, 1500.0);
    EXPECT_LT(sFit.sCheck.dfMax, f.dfRpcBound);
    EXPECT_GT(sFit.sCheck.nPoints, 2000);

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

INSTANTIATE_TEST_SUITE_P(
    Examples, FamilyProperty,
    // The rigorous transforms are approximate inverses of each other (the
    // exact inverse is SRITGeo2ImgExact, below): within a pixel. Rigorous,
    // radar and rational models are smooth enough for a cubic ratio to
    // follow them to thousandths of a pixel; a spline through control points
    // and a frame camera with lens distortion only to hundredths; a scanner
    // whose swath spans thousands of kilometres only to a few pixels.
    testing::Values(Family{"poly_utm31.json", 0.05, 0.5, false, true, false, 1e-3},
                    Family{"tps_utm31.json", 0.05, 0.5, false, true, false, 0.1},
                    Family{"rf_scene.json", 1e-6, 1e-9, true, false, true, 1e-3},
                    Family{"ap_frame_utm31.json", 1e-4, 1e-3, true, false, true, 0.2},
                    Family{"srit_spot5_roll20.json", 1.0, 6.0, true, true, false, 0.02},
                    Family{"rtcs_scene.json", 1e-6, 1e-9, true, true, false, 0.01},
                    Family{"lrs_avhrr_pass.json", 0.01, 1e-4, true, true, false, 4.0}));

// The rigorous model's iterative ground-to-image forms, checked by its
// image-to-ground equations.
TEST(InverseProperty, RigorousExactFormAndRadarRefinement) {
    const lumo::cli::LoadedModel model =
        lumo::cli::ReadModelFile(kExamples + "srit_spot5_roll20.json");
    auto* psModel = static_cast<SRITInfo_t*>(model.poRecord.get());
    const Map backToGround = [&](double p, double l, double z, double* x, double* y) {
        return SRITImg2Geo_imp(psModel, p, l, z, x, y) == 1;
    };
    const double size = psModel->psEphemeris->dfPixelRes;
    const double half = size * model.sEnvelope.nPixels / 2.0;
    const Start centre{psModel->adfCoef[16], psModel->adfCoef[17], 500.0};
    // The exact form: back within 1e-3 of a pixel's ground size.
    const Map exact = [&](double x, double y, double z, double* p, double* l) {
        return SRITGeo2ImgExact(psModel, x, y, z, p, l) == 1;
    };
    ExpectSuccessesProjectBack(centre, {half, half, 500.0}, exact, backToGround, 1e-3 * size);
    // The radar class refines until the ground closes to 10 units.
    psModel->nModelClass = 6;
    const Map refined = [&](double x, double y, double z, double* p, double* l) {
        SRITGeo2Img(psModel, x, y, z, p, l);
        return *p != LUMO_NULL_VALUE;
    };
    ExpectSuccessesProjectBack(centre, {half, half, 500.0}, refined, backToGround, 10.0);
}

}  // namespace
