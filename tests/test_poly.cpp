// Polynomial model: every term count against an independent sum, invalid
// counts and null arguments, copy and release.
#include <gtest/gtest.h>

#include <cstring>
#include <random>
#include <vector>

#include "lumo.h"
#include "projection.h"
#include "runtime.h"
#include "support/model_records.h"
#include "support/poly_terms.h"
#include "support/warnings.h"

namespace {

using lumo::support::WarningCapture;

using lumo::support::PolyPtr;

using lumo::support::TermSum;

TEST(Poly, EveryTermCountMatchesAnIndependentSum) {
    PolyPtr p(POLYAllocate());
    std::mt19937 oRng(42);
    std::uniform_real_distribution<double> oCoef(-2.0, 2.0);
    for (int k = 0; k < 21; ++k) {
        p->padfPixelCoeffs[k] = oCoef(oRng);
        p->padfLineCoeffs[k] = oCoef(oRng);
        p->padfXCoeffs[k] = oCoef(oRng);
        p->padfYCoeffs[k] = oCoef(oRng);
    }
    const double u = 1.37, v = -0.81;
    for (int n = 1; n <= 21; ++n) {
        p->nCoeffs = n;
        double dfPixel = 0, dfLine = 0, dfX = 0, dfY = 0;
        POLYGeo2Img(p.get(), u, v, &dfPixel, &dfLine);
        POLYImg2Geo(p.get(), u, v, &dfX, &dfY);
        EXPECT_NEAR(dfPixel, TermSum(p->padfPixelCoeffs, n, u, v), 1e-12) << n;
        EXPECT_NEAR(dfLine, TermSum(p->padfLineCoeffs, n, u, v), 1e-12) << n;
        EXPECT_NEAR(dfX, TermSum(p->padfXCoeffs, n, u, v), 1e-12) << n;
        EXPECT_NEAR(dfY, TermSum(p->padfYCoeffs, n, u, v), 1e-12) << n;
    }
}

// Warning 11 for an empty record, a count outside 1..21 (evaluated as if
// clamped, never read past coefficient 20), a null record or output.
TEST(Poly, InvalidCountsNullRecordsAndOutputs) {
    PolyPtr p(POLYAllocate());
    WarningCapture oWarnings;
    double dfPixel = 9, dfLine = 9;
    POLYGeo2Img(p.get(), 10.0, 20.0, &dfPixel, &dfLine);  // fresh record: zero
    EXPECT_EQ(dfPixel, 0.0);
    EXPECT_EQ(dfLine, 0.0);
    p->padfPixelCoeffs[0] = 5.0;
    for (int k = 0; k < 21; ++k) p->padfLineCoeffs[k] = 0.1 * (k + 1);
    p->nCoeffs = 0;
    POLYGeo2Img(p.get(), 4.0, 1.0, &dfPixel, &dfLine);
    EXPECT_DOUBLE_EQ(dfPixel, 5.0);
    EXPECT_DOUBLE_EQ(dfLine, 0.1);
    p->nCoeffs = -3;
    POLYImg2Geo(p.get(), 4.0, 1.0, &dfPixel, &dfLine);
    p->nCoeffs = 22;
    POLYGeo2Img(p.get(), 1.5, 0.5, &dfPixel, &dfLine);
    EXPECT_NEAR(dfLine, TermSum(p->padfLineCoeffs, 21, 1.5, 0.5), 1e-12);

    double dfA = 5.0, dfB = 6.0;
    POLYGeo2Img(nullptr, 1.0, 2.0, &dfA, &dfB);
    POLYImg2Geo(p.get(), 1.0, 2.0, nullptr, &dfB);
    EXPECT_EQ(dfA, 5.0);
    EXPECT_EQ(dfB, 6.0);
    EXPECT_EQ(oWarnings.Codes(), (std::vector<int>(6, 11)));
    // The dispatch refuses a null height pointer; a height is neither needed
    // nor written.
    p->nCoeffs = 3;
    p->padfXCoeffs[1] = 0.5;
    EXPECT_EQ(GenImg2GeoDem(4, p.get(), 1.0, 2.0, nullptr, &dfA, &dfB), 0);
    double dfZ = 123.0;
    EXPECT_EQ(GenImg2GeoDem(4, p.get(), 16.0, 2.0, &dfZ, &dfA, &dfB), 1);
    EXPECT_DOUBLE_EQ(dfA, 8.0);
    EXPECT_EQ(dfZ, 123.0);
}

TEST(Poly, CopyIsDeepAndGuardsItsCount) {
    PolyPtr src(POLYAllocate());
    PolyPtr dst(POLYAllocate());
    src->nCoeffs = 6;
    src->nPixels = 6000;
    src->nLines = 5000;
    std::strcpy(src->pszGeosys, "UTM 31 U D000");
    ASSERT_EQ(Geosys2ProjInfo(src->psProjInfo, "UTM 31 U D000", 0.0, 0.0, 1.0, 1.0), 0);
    for (int k = 0; k < 21; ++k) {
        src->padfPixelCoeffs[k] = k + 1.0;
        src->padfXCoeffs[k] = 100.0 + k;
        dst->padfXCoeffs[k] = -9.0;
    }
    ProjInfo_t* psDstProj = dst->psProjInfo;
    POLYCopy(dst.get(), src.get());
    EXPECT_STREQ(dst->pszGeosys, "UTM 31 U D000");
    EXPECT_EQ(dst->psProjInfo, psDstProj);  // own block, new contents
    EXPECT_EQ(std::memcmp(dst->psProjInfo, src->psProjInfo, sizeof(ProjInfo_t)), 0);
    EXPECT_EQ(dst->padfXCoeffs[6], -9.0);  // beyond nCoeffs: untouched

    // The copy survives its source.
    src.reset();
    double dfPixel = 0, dfLine = 0;
    POLYGeo2Img(dst.get(), 1.0, 1.0, &dfPixel, &dfLine);
    EXPECT_DOUBLE_EQ(dfPixel, 1 + 2 + 3 + 4 + 5 + 6);

    // Self copy and null sides change nothing.
    POLYCopy(dst.get(), dst.get());
    POLYCopy(dst.get(), nullptr);
    POLYCopy(nullptr, dst.get());
    EXPECT_EQ(dst->nCoeffs, 6);

    // A damaged count never overruns the 21-coefficient arrays.
    PolyPtr bad(POLYAllocate());
    bad->nCoeffs = 1000;
    bad->padfXCoeffs[20] = 3.5;
    POLYCopy(dst.get(), bad.get());
    EXPECT_EQ(dst->padfXCoeffs[20], 3.5);
    bad->nCoeffs = -5;
    POLYCopy(dst.get(), bad.get());
    EXPECT_EQ(dst->nCoeffs, -5);

    POLYDeallocate(nullptr);
}

}  // namespace
