// Every iterative inverse is honest: random points inside and far outside a
// model's domain go through the inverse, and any point reported as success
// projects back onto the point asked for within the tolerance.
#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <random>
#include <string>

#include "lumo.h"
#include "model_io.h"

namespace {

const std::string kExamples = std::string(LUMO_SOURCE_DIR) + "/examples/";

// A point of the space the inverse starts from, and its height.
struct Start {
    double a, b, z;
};

// The inverse maps (a, b) at height z to (c, d) and returns whether it
// succeeded; the forward maps (c, d, z) back to (a, b).
using Map = std::function<bool(double a, double b, double z, double* c, double* d)>;

// Draws points around `centre` at distances of `half` times 0.5 to 1e4, and
// heights from the model's range to 1e9 m. Returns the share of successes.
double SuccessesProjectBack(const Start& centre, const Start& half, const Map& inverse,
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
    return static_cast<double>(successes) / total;
}

// Image to ground through the generic dispatch, checked by ground to image.
double ImageInverseIsHonest(const std::string& osModel, double dfHeight, double dfHeightHalf) {
    const lumo::cli::LoadedModel model = lumo::cli::ReadModelFile(kExamples + osModel);
    void* record = model.poRecord.get();
    const int code = model.nModelCode;
    const Map inverse = [&](double p, double l, double z, double* x, double* y) {
        return GenImg2Geo(code, record, p, l, z, x, y) == 1;
    };
    const Map forward = [&](double x, double y, double z, double* p, double* l) {
        return GenGeo2Img(code, record, x, y, z, p, l) == 1;
    };
    const double w = model.sEnvelope.nPixels / 2.0, h = model.sEnvelope.nLines / 2.0;
    return SuccessesProjectBack({w, h, dfHeight}, {w, h, dfHeightHalf}, inverse, forward, 1e-3);
}

TEST(InverseProperty, RationalFunctions) {
    const double share = ImageInverseIsHonest("rf_scene.json", 800.0, 500.0);
    EXPECT_GT(share, 0.3);  // the test is not vacuous
    EXPECT_LT(share, 1.0);  // and far points do fail
}

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
    double share =
        SuccessesProjectBack(centre, {half, half, 500.0}, exact, backToGround, 1e-3 * size);
    EXPECT_GT(share, 0.3);
    EXPECT_LT(share, 1.0);
    // The radar class refines until the ground closes to 10 units.
    psModel->nModelClass = 6;
    const Map refined = [&](double x, double y, double z, double* p, double* l) {
        SRITGeo2Img(psModel, x, y, z, p, l);
        return *p != LUMO_NULL_VALUE;
    };
    share = SuccessesProjectBack(centre, {half, half, 500.0}, refined, backToGround, 10.0);
    EXPECT_GT(share, 0.3);
    EXPECT_LT(share, 1.0);
}

TEST(InverseProperty, AerialPhoto) {
    const double share = ImageInverseIsHonest("ap_frame_utm31.json", 100.0, 100.0);
    EXPECT_GT(share, 0.3);
    EXPECT_LT(share, 1.0);
}

}  // namespace
