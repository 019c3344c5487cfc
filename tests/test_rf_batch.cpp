// Batch forms of the rational functions against the point functions, on one
// thread and on several.
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <random>
#include <vector>

#include "lumo.h"
#include "nova/parallel.h"
#include "support/model_records.h"
#include "support/warnings.h"

namespace {

using lumo::support::WarningCapture;

struct Points {
    std::vector<double> a, b, z;
};

struct Results {
    std::vector<double> out1, out2;
    std::vector<int> valid;
    int status = -1;
};

// Ground points over 1.2 times the model's cube (some heights null), with a
// few that cannot be evaluated.
Points GroundPoints(const RFInfo_t& rf, std::size_t n) {
    std::mt19937 rng(17);
    std::uniform_real_distribution<double> unit(-1.2, 1.2);
    Points p;
    for (std::size_t i = 0; i < n; ++i) {
        p.a.push_back(rf.dfXOffset + unit(rng) * rf.dfXScale);
        p.b.push_back(rf.dfYOffset + unit(rng) * rf.dfYScale);
        p.z.push_back(i % 97 == 0 ? LUMO_NULL_VALUE : rf.dfZOffset + unit(rng) * rf.dfZScale);
    }
    p.a[5] = std::nan("");
    p.b[7] = INFINITY;
    return p;
}

template <typename Batch>
Results RunBatch(Batch fnBatch, RFInfo_t* psRF, const Points& p, int nThreads) {
    nova::SetEvaluationThreads(nThreads);
    Results r;
    r.out1.assign(p.a.size(), 0.0);
    r.out2.assign(p.a.size(), 0.0);
    r.valid.assign(p.a.size(), -1);
    r.status = fnBatch(psRF, static_cast<int>(p.a.size()), p.a.data(), p.b.data(), p.z.data(),
                       r.out1.data(), r.out2.data(), r.valid.data());
    nova::SetEvaluationThreads(0);
    return r;
}

void ExpectSameBits(const Results& one, const Results& many) {
    EXPECT_EQ(one.status, many.status);
    EXPECT_EQ(one.valid, many.valid);
    EXPECT_EQ(0, std::memcmp(one.out1.data(), many.out1.data(), one.out1.size() * 8));
    EXPECT_EQ(0, std::memcmp(one.out2.data(), many.out2.data(), one.out2.size() * 8));
}

}  // namespace

// For the half-pixel shift, an image-space adjustment and a shorter model:
// the batch forward agrees with RFGeo2Img point by point, the batch inverse
// succeeds where RFImg2Geo does and agrees with it within 1e-7 pixel, and
// neither depends on the number of threads.
TEST(RFBatch, AgreesWithThePointFunctionsOnAnyThreadCount) {
    constexpr std::size_t kCount = 70000;  // enough for two threads in each form
    for (int nCase = 0; nCase < 3; ++nCase) {
        lumo::support::RfPtr psRF = lumo::support::RfSceneModel();
        if (nCase == 1) {
            psRF->nAdjust = 1;
            const double adfPixel[6] = {1.5, 1e-4, -2e-4, 1e-9, 2e-9, -1e-9};
            std::copy(adfPixel, adfPixel + 6, psRF->adfPixelAdjust);
            psRF->adfLineAdjust[0] = -2.0;
        }
        if (nCase == 2) psRF->nTerms = 13;
        const Points ground = GroundPoints(*psRF, kCount);
        WarningCapture oQuiet;
        const Results fwd = RunBatch(RFGeo2ImgBatch, psRF.get(), ground, 1);
        ExpectSameBits(fwd, RunBatch(RFGeo2ImgBatch, psRF.get(), ground, 2));
        EXPECT_EQ(0, fwd.status);  // the two unusable points
        for (std::size_t i = 0; i < kCount; ++i) {
            double p = 0.0, l = 0.0;
            RFGeo2Img(psRF.get(), ground.a[i], ground.b[i], ground.z[i], &p, &l);
            ASSERT_EQ(p != LUMO_NULL_VALUE, fwd.valid[i] == 1) << i;
            ASSERT_NEAR(p, fwd.out1[i], 1e-9) << i;
            ASSERT_NEAR(l, fwd.out2[i], 1e-9) << i;
        }

        // The forward takes a null height as 0, the inverse as the offset.
        Points image{fwd.out1, fwd.out2, ground.z};
        for (double& z : image.z) z = z == LUMO_NULL_VALUE ? 0.0 : z;
        const Results inv = RunBatch(RFImg2GeoBatch, psRF.get(), image, 1);
        ExpectSameBits(inv, RunBatch(RFImg2GeoBatch, psRF.get(), image, 2));
        for (std::size_t i = 0; i < kCount; ++i) {
            double x = 0.0, y = 0.0, z = image.z[i];
            const int nPoint =
                fwd.valid[i] == 1 ? RFImg2Geo(psRF.get(), image.a[i], image.b[i], &x, &y, &z) : 0;
            ASSERT_EQ(nPoint, inv.valid[i]) << i;
            if (nPoint == 0) {
                ASSERT_EQ(LUMO_NULL_VALUE, inv.out1[i]);
                continue;
            }
            // Both answers seen through the forward functions (with an
            // adjustment, the inverse is not exactly the forward's).
            double p = 0.0, l = 0.0, pPoint = 0.0, lPoint = 0.0;
            RFGeo2Img(psRF.get(), inv.out1[i], inv.out2[i], image.z[i], &p, &l);
            RFGeo2Img(psRF.get(), x, y, image.z[i], &pPoint, &lPoint);
            ASSERT_NEAR(pPoint, p, 1e-7) << i;
            ASSERT_NEAR(lPoint, l, 1e-7) << i;
        }
    }
}

TEST(RFBatch, RefusesBadCallsWithoutWritingAndNamesBadPoints) {
    lumo::support::RfPtr psRF = lumo::support::RfSceneModel();
    std::vector<double> in(10, 100.0), out1(10, -3.0), out2(10, -3.0);
    WarningCapture oCapture;
    RFInfo_t* ps = psRF.get();
    const double* pin = in.data();
    EXPECT_EQ(0, RFGeo2ImgBatch(ps, -1, pin, pin, pin, out1.data(), out2.data(), nullptr));
    EXPECT_EQ(0, RFGeo2ImgBatch(ps, 10, nullptr, pin, pin, out1.data(), out2.data(), nullptr));
    EXPECT_EQ(0, RFImg2GeoBatch(ps, 10, pin, pin, pin, out1.data(), out1.data(), nullptr));
    psRF->dfLineScale = 0.0;
    EXPECT_EQ(0, RFImg2GeoBatch(ps, 10, pin, pin, pin, out1.data(), out2.data(), nullptr));
    ASSERT_EQ(4u, oCapture.maoReports.size());
    EXPECT_NE(std::string::npos, oCapture.maoReports[0].osText.find("-1"));
    EXPECT_NE(std::string::npos, oCapture.maoReports[3].osText.find("dfLineScale"));
    for (double v : out1) ASSERT_EQ(-3.0, v);
    for (double v : out2) ASSERT_EQ(-3.0, v);

    // Non-finite inputs of the inverse fail their points; one warning names
    // the first. Null heights take the model's height offset.
    psRF->dfLineScale = 5000.0;
    in[3] = std::nan("");
    in[6] = INFINITY;
    const std::vector<double> pixel(10, 100.0), z(10, LUMO_NULL_VALUE);
    std::vector<int> valid(10, -1);
    EXPECT_EQ(0, RFImg2GeoBatch(ps, 10, pixel.data(), in.data(), z.data(), out1.data(), out2.data(),
                                valid.data()));
    ASSERT_EQ(5u, oCapture.maoReports.size());
    EXPECT_NE(std::string::npos, oCapture.maoReports[4].osText.find("point 3 has line"))
        << oCapture.maoReports[4].osText;
    EXPECT_EQ((std::vector<int>{1, 1, 1, 0, 1, 1, 0, 1, 1, 1}), valid);
    double x = 0.0, y = 0.0, dfZ = LUMO_NULL_VALUE;
    ASSERT_EQ(1, RFImg2Geo(ps, 100.0, 100.0, &x, &y, &dfZ));
    EXPECT_NEAR(x, out1[0], 1e-9);
    EXPECT_EQ(LUMO_NULL_VALUE, out2[3]);
    // An output that is its own input is read before it is written.
    std::vector<double> lineInOut = in;
    EXPECT_EQ(0, RFImg2GeoBatch(ps, 10, pixel.data(), lineInOut.data(), nullptr, out1.data(),
                                lineInOut.data(), nullptr));
    EXPECT_NE(std::string::npos, oCapture.maoReports.back().osText.find("point 3 has line"));
    EXPECT_EQ(out2[0], lineInOut[0]);
    EXPECT_EQ(1, RFGeo2ImgBatch(ps, 0, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr));
}
