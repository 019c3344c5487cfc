// Generic array and block evaluation of math models through their point
// operations.

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstddef>
#include <cstring>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "nova/mathmodel_core.h"
#include "nova/parallel.h"
#include "nova/runtime.h"
#include "support/model_stubs.h"
#include "support/warnings.h"

namespace nm = nova::mathmodel;

namespace {

using lumo::support::WarningCapture;

constexpr float kNullF = static_cast<float>(nm::kMathModelNullValue);

// Smooth analytic distortion: pixel/line/height -> X/Y, with a Newton inverse.
// Counts point calls so tests can tell interpolation from exact evaluation.
class SmoothModel : public lumo::support::PointDrivenModel {
  public:
    using PointDrivenModel::GroundToImage;
    using PointDrivenModel::ImageToGround;

    int ImageToGround(double dfPixel, double dfLine, double dfZ, double& dfX, double& dfY,
                      bool) const override {
        ++mnCalls;
        if (dfPixel >= mdfFailFromPixel) return -1;
        Forward(dfPixel, dfLine, dfZ, dfX, dfY);
        if (dfPixel >= mdfNaNFromPixel) dfX = std::nan("");
        return 0;
    }
    int GroundToImage(double dfX, double dfY, double dfZ, double& dfPixel, double& dfLine,
                      bool) const override {
        ++mnCalls;
        if (!Inverse(dfX, dfY, dfZ, dfPixel, dfLine)) return -1;
        return dfPixel >= mdfFailFromPixel ? -1 : 0;
    }
    IMathModel* Clone() const override { return new SmoothModel(*this); }

    static void Forward(double u, double v, double z, double& x, double& y) {
        x = 1000.0 + 2.0 * u + 0.3 * v + 4e-5 * u * v + 6.0 * std::sin(u / 250.0) +
            0.004 * z * (1.0 + u / 2000.0);
        y = 9000.0 - 2.0 * v + 0.2 * u + 2e-5 * u * u + 4.0 * std::cos(v / 300.0) - 0.003 * z;
    }

    // Newton iteration on Forward with its analytic Jacobian.
    static bool Inverse(double x, double y, double z, double& u, double& v) {
        u = (x - 1000.0) / 2.0;
        v = (9000.0 - y) / 2.0;
        for (int i = 0; i < 30; ++i) {
            double fx = 0.0;
            double fy = 0.0;
            Forward(u, v, z, fx, fy);
            const double a = 2.0 + 4e-5 * v + 6.0 / 250.0 * std::cos(u / 250.0) + 0.004 * z / 2000;
            const double b = 0.3 + 4e-5 * u;
            const double c = 0.2 + 4e-5 * u;
            const double d = -2.0 - 4.0 / 300.0 * std::sin(v / 300.0);
            const double det = a * d - b * c;
            const double du = (d * (fx - x) - b * (fy - y)) / det;
            const double dv = (-c * (fx - x) + a * (fy - y)) / det;
            u -= du;
            v -= dv;
            if (std::fabs(du) + std::fabs(dv) < 1e-11) return true;
        }
        return false;
    }

    double mdfFailFromPixel = 1e30;  // point operations fail at pixels at or beyond
    double mdfNaNFromPixel = 1e30;   // forward gives NaN X (with success) at or beyond
    mutable std::atomic<long> mnCalls{0};

    SmoothModel() : PointDrivenModel("Smooth", nm::MM_TYPE_USER, 4000, 3000, true) {}
    SmoothModel(const SmoothModel& o)
        : PointDrivenModel(o),
          mdfFailFromPixel(o.mdfFailFromPixel),
          mdfNaNFromPixel(o.mdfNaNFromPixel) {}
};

class ThrowingModel : public SmoothModel {
  public:
    int ImageToGround(double dfPixel, double dfLine, double dfZ, double& dfX, double& dfY,
                      bool b) const override {
        if (dfPixel > 5) throw std::runtime_error("model broke");
        return SmoothModel::ImageToGround(dfPixel, dfLine, dfZ, dfX, dfY, b);
    }
    using SmoothModel::ImageToGround;
};

// A terrain of smooth hills and a sharp step of 150 m, in metres.
std::vector<float> Terrain(int nCols, int nRows) {
    return lumo::support::HillTerrain(nCols, nRows, 150.0);
}

// Largest spacing between adjacent floats near v: the output's own precision.
double FloatUlp(double v) {
    const float f = static_cast<float>(std::fabs(v));
    return std::nextafter(f, 1e30f) - f;
}

struct Block {
    explicit Block(int c, int r)
        : nCols(c), nRows(r), afOut1(Size(), -7.0f), afOut2(Size(), -7.0f), abyValid(Size(), 9) {}
    std::size_t Size() const { return static_cast<std::size_t>(nCols) * nRows; }
    // Calls fn(column, row, index) for every cell, row by row.
    template <typename F>
    void ForEachCell(F fn) const {
        for (int r = 0; r < nRows; ++r)
            for (int c = 0; c < nCols; ++c) fn(c, r, static_cast<std::size_t>(r) * nCols + c);
    }
    int nCols;
    int nRows;
    std::vector<float> afOut1;
    std::vector<float> afOut2;
    std::vector<unsigned char> abyValid;
};

// The block form image -> ground over a regular image grid into oOut.
int ImageToGroundBlock(const nm::IMathModel* poModel, Block& oOut, int nStep, const float* pafZ,
                       double dfPixel0, double dfLine0, double dfPixelStep, double dfLineStep,
                       double dfTol) {
    return nm::ImageToGround(poModel, oOut.nCols, oOut.nRows, nStep, nullptr, nullptr, pafZ,
                             oOut.afOut1.data(), oOut.afOut2.data(), oOut.abyValid.data(), dfPixel0,
                             dfLine0, dfPixelStep, dfLineStep, dfTol, false);
}

}  // namespace

TEST(MathModelCore, ArrayFormEqualsPointCallsAndFlagsFailures) {
    SmoothModel oModel;
    oModel.mdfFailFromPixel = 70.0;
    oModel.mdfNaNFromPixel = 90.0;
    std::vector<double> adfPixel(100);
    for (std::size_t i = 0; i < adfPixel.size(); ++i) adfPixel[i] = static_cast<double>(i) * 1.01;
    adfPixel[3] = std::nan("");
    adfPixel[4] = nm::kMathModelNullValue;
    const int n = static_cast<int>(adfPixel.size());
    std::vector<double> adfX(n), adfY(n);
    std::vector<int> anValid(n, 7);

    // Through the interface's array slot, which forwards to the free function.
    const nm::IMathModel& oIface = oModel;
    EXPECT_EQ(-1, oIface.ImageToGround(123.5, 250.0, n, adfPixel.data(), adfX.data(), adfY.data(),
                                       anValid.data(), false));
    for (int i = 0; i < n; ++i) {
        double dfX = 0.0;
        double dfY = 0.0;
        const bool bExpected = i != 3 && i != 4 && adfPixel[i] < 70.0;
        ASSERT_EQ(bExpected ? 1 : 0, anValid[i]) << i;
        if (bExpected) {
            ASSERT_EQ(0, oModel.ImageToGround(adfPixel[i], 123.5, 250.0, dfX, dfY, false));
            EXPECT_EQ(dfX, adfX[i]);
            EXPECT_EQ(dfY, adfY[i]);
        } else {
            EXPECT_EQ(nm::kMathModelNullValue, adfX[i]);
            EXPECT_EQ(nm::kMathModelNullValue, adfY[i]);
        }
    }

    // NaN results reported as success are failures too.
    oModel.mdfFailFromPixel = 1e30;
    EXPECT_EQ(-1, nm::ImageToGround(&oModel, 10.0, 0.0, n, adfPixel.data(), adfX.data(),
                                    adfY.data(), anValid.data(), false));
    EXPECT_EQ(0, anValid[95]);
    EXPECT_EQ(1, anValid[80]);

    // A null height fails every point of a ground row; an empty row succeeds.
    std::vector<double> adfGX(50, 1100.0), adfP(50), adfL(50);
    EXPECT_EQ(-1, nm::GroundToImage(&oModel, 8500.0, nm::kMathModelNullValue, 50, adfGX.data(),
                                    adfP.data(), adfL.data(), anValid.data(), false));
    EXPECT_EQ(0, anValid[0]);
    EXPECT_EQ(0,
              nm::ImageToGround(&oModel, 1.0, 0.0, 0, nullptr, nullptr, nullptr, nullptr, false));
}

// The block form against the point form, cell by cell: a cell is valid
// exactly when its point call succeeds with a finite result on a height that
// is given; valid cells are exact with zero tolerance or a unit step, within
// the tolerance (with far fewer point calls) otherwise; failed cells hold the
// null value.
TEST(MathModelCore, BlockFormMatchesPointForm) {
    struct Case {
        const char* pszName;
        int nCols, nRows, nStep;
        double dfTol;
        bool bTerrain;
        double dfPixel0, dfLine0, dfPixelStep, dfLineStep;
        double dfFailFrom = 1e30, dfNaNFrom = 1e30;  // the model's failing pixels
        bool bHoles = false, bMask = true;
    };
    // 994 columns leave a one-point-wide last grid cell. Plain bilinear
    // interpolation over 32 points errs by ~0.012 on this model: the checks
    // have to split cells to stay within 0.004. Failures: a half-plane across
    // grid cells, height holes that fail their point only, and success
    // reported with a NaN result (without a mask).
    const Case aCases[] = {
        {"step 8, zero tolerance", 37, 29, 8, 0.0, true, 10.0, 20.0, 1.5, 2.5},
        {"unit step", 37, 29, 1, 5.0, true, 10.0, 20.0, 1.5, 2.5},
        {"flat, tolerance", 994, 701, 32, 0.004, false, 0.0, 0.0, 1.0, 1.0},
        {"terrain, tolerance", 994, 701, 32, 0.004, true, 0.0, 0.0, 1.0, 1.0},
        {"failures, zero tolerance", 600, 90, 64, 0.0, true, 0.0, 0.0, 1.0, 1.0, 403.5, 1e30, true},
        {"failures, tolerance", 600, 90, 64, 0.05, true, 0.0, 0.0, 1.0, 1.0, 403.5, 1e30, true},
        {"NaN results", 100, 10, 16, 0.05, false, 0.0, 0.0, 1.0, 1.0, 1e30, 50.0, false, false},
    };
    for (const Case& k : aCases) {
        SCOPED_TRACE(k.pszName);
        SmoothModel oModel;
        oModel.mdfFailFromPixel = k.dfFailFrom;
        oModel.mdfNaNFromPixel = k.dfNaNFrom;
        std::vector<float> afZ = Terrain(k.nCols, k.nRows);
        if (k.bHoles) {
            afZ[5 * k.nCols + 17] = kNullF;
            afZ[60 * k.nCols + 200] = std::nanf("");
        }
        const float* pafZ = k.bTerrain ? afZ.data() : nullptr;
        Block oOut(k.nCols, k.nRows);
        const int nResult = nm::ImageToGround(
            &oModel, k.nCols, k.nRows, k.nStep, nullptr, nullptr, pafZ, oOut.afOut1.data(),
            oOut.afOut2.data(), k.bMask ? oOut.abyValid.data() : nullptr, k.dfPixel0, k.dfLine0,
            k.dfPixelStep, k.dfLineStep, k.dfTol, false);
        const long nBlockCalls = oModel.mnCalls;
        const bool bExact = k.dfTol == 0.0 || k.nStep == 1;
        bool bAllValid = true;
        double dfWorst = 0.0;
        oOut.ForEachCell([&](int c, int r, std::size_t i) {
            const bool bHole = pafZ && !(std::isfinite(pafZ[i]) && pafZ[i] != kNullF);
            double dfX = 0.0;
            double dfY = 0.0;
            const bool bValid =
                oModel.ImageToGround(k.dfPixel0 + k.dfPixelStep * c, k.dfLine0 + k.dfLineStep * r,
                                     pafZ ? pafZ[i] : 0.0, dfX, dfY, false) == 0 &&
                std::isfinite(dfX) && !bHole;
            bAllValid = bAllValid && bValid;
            if (k.bMask) {
                ASSERT_EQ(bValid ? 1 : 0, oOut.abyValid[i]) << c << "," << r;
            }
            if (!bValid) {
                ASSERT_EQ(kNullF, oOut.afOut1[i]) << c << "," << r;
                ASSERT_EQ(kNullF, oOut.afOut2[i]) << c << "," << r;
                return;
            }
            if (bExact) {
                ASSERT_EQ(static_cast<float>(dfX), oOut.afOut1[i]) << c << "," << r;
                ASSERT_EQ(static_cast<float>(dfY), oOut.afOut2[i]) << c << "," << r;
            }
            dfWorst = std::max({dfWorst, std::fabs(oOut.afOut1[i] - dfX) - FloatUlp(dfX),
                                std::fabs(oOut.afOut2[i] - dfY) - FloatUlp(dfY)});
        });
        EXPECT_EQ(nResult, bAllValid ? 0 : -1);
        EXPECT_LE(dfWorst, k.dfTol);
        if (bAllValid && !bExact) {
            EXPECT_LT(nBlockCalls, static_cast<long>(oOut.Size() / 4));
        }
    }
}

TEST(MathModelCore, BlockRoundTripThroughExplicitInputArrays) {
    // Image grid -> ground, then the ground positions (irregular, from the
    // first pass, and moved off the cells' bilinear surfaces by up to 2 m so
    // that the first-order correction for the inputs matters) back to image:
    // the point form's pixels, the pixel grid itself where nothing moved.
    SmoothModel oModel;
    const std::vector<float> afZ = Terrain(300, 260);
    Block oGround(300, 260);
    ASSERT_EQ(0, ImageToGroundBlock(&oModel, oGround, 16, afZ.data(), 100.0, 50.0, 1.0, 1.0, 0.01));
    oGround.ForEachCell([&](int c, int r, std::size_t i) {
        oGround.afOut1[i] += static_cast<float>(r < 130 ? 2.0 * std::sin(0.9 * c + 0.4 * r) : 0.0);
    });
    Block oImage(300, 260);
    oModel.mnCalls = 0;
    ASSERT_EQ(0,
              nm::GroundToImage(&oModel, 300, 260, 16, oGround.afOut1.data(), oGround.afOut2.data(),
                                afZ.data(), oImage.afOut1.data(), oImage.afOut2.data(),
                                oImage.abyValid.data(), 0, 0, 0, 0, 0.01, false));
    EXPECT_LT(oModel.mnCalls.load(), static_cast<long>(oImage.Size() / 4));
    oImage.ForEachCell([&](int c, int r, std::size_t i) {
        double dfPixel = 100.0 + c, dfLine = 50.0 + r;
        if (r < 130) {
            ASSERT_EQ(0, oModel.GroundToImage(oGround.afOut1[i], oGround.afOut2[i], afZ[i], dfPixel,
                                              dfLine, false));
        }
        ASSERT_EQ(1, oImage.abyValid[i]);
        // Ground X/Y as floats carry up to ~1e-3 m, i.e. ~5e-4 pixel.
        ASSERT_NEAR(dfPixel, oImage.afOut1[i], 0.02) << c << "," << r;
        ASSERT_NEAR(dfLine, oImage.afOut2[i], 0.02) << c << "," << r;
    });
}

TEST(MathModelCore, BadArgumentsAreRejectedWithoutWriting) {
    SmoothModel oModel;
    WarningCapture oCapture;
    Block oOut(10, 10);
    std::vector<float> afIn(100, 1.0f);
    std::vector<double> adfIn(10, 1.0), adfOut(10, -3.0);
    auto Block10 = [&](const nm::IMathModel* poModel, int nCols, int nRows, int nStep,
                       const float* pafA, const float* pafB, float* pafOut1, double dfOrigin,
                       double dfTol) {
        return nm::GroundToImage(poModel, nCols, nRows, nStep, pafA, pafB, nullptr, pafOut1,
                                 oOut.afOut2.data(), oOut.abyValid.data(), dfOrigin, 0.0, 1.0, 1.0,
                                 dfTol, false);
    };
    float* pafO1 = oOut.afOut1.data();
    EXPECT_EQ(-1, Block10(nullptr, 10, 10, 4, nullptr, nullptr, pafO1, 0.0, 0.1));
    EXPECT_EQ(-1, Block10(&oModel, -1, 10, 4, nullptr, nullptr, pafO1, 0.0, 0.1));
    EXPECT_EQ(-1, Block10(&oModel, 10, -5, 4, nullptr, nullptr, pafO1, 0.0, 0.1));
    EXPECT_EQ(-1, Block10(&oModel, 10, 10, 0, nullptr, nullptr, pafO1, 0.0, 0.1));
    EXPECT_EQ(-1, Block10(&oModel, 10, 10, 4, afIn.data(), nullptr, pafO1, 0.0, 0.1));
    EXPECT_EQ(-1, Block10(&oModel, 10, 10, 4, nullptr, nullptr, nullptr, 0.0, 0.1));
    EXPECT_EQ(-1, Block10(&oModel, 10, 10, 4, nullptr, nullptr, pafO1, std::nan(""), 0.1));
    EXPECT_EQ(-1, Block10(&oModel, 10, 10, 4, nullptr, nullptr, pafO1, 0.0, std::nan("")));
    EXPECT_EQ(-1, Block10(&oModel, 10, 10, 4, afIn.data(), afIn.data(), afIn.data(), 0.0, 0.1));
    EXPECT_EQ(-1, nm::ImageToGround(nullptr, 0.0, 0.0, 10, adfIn.data(), adfOut.data(),
                                    adfOut.data(), nullptr, false));
    EXPECT_EQ(-1, nm::ImageToGround(&oModel, 0.0, 0.0, -2, adfIn.data(), adfOut.data(),
                                    adfOut.data(), nullptr, false));
    EXPECT_EQ(-1, nm::GroundToImage(&oModel, 0.0, 0.0, 10, nullptr, adfOut.data(), adfOut.data(),
                                    nullptr, false));
    ASSERT_EQ(12u, oCapture.maoReports.size());
    for (const auto& oReport : oCapture.maoReports) {
        EXPECT_EQ(11, oReport.nCode);
        EXPECT_FALSE(oReport.bFatal);
    }
    EXPECT_NE(std::string::npos, oCapture.maoReports[1].osText.find("-1 x 10"));
    EXPECT_NE(std::string::npos, oCapture.maoReports[10].osText.find("-2"));
    EXPECT_EQ(0L, oModel.mnCalls.load());
    EXPECT_EQ(oOut.afOut1, std::vector<float>(100, -7.0f));
    EXPECT_EQ(oOut.abyValid, std::vector<unsigned char>(100, 9));
    EXPECT_EQ(adfOut, std::vector<double>(10, -3.0));

    // Empty blocks are not an error and need no arrays.
    EXPECT_EQ(0, nm::ImageToGround(&oModel, 0, 5, 4, nullptr, nullptr, nullptr, nullptr, nullptr,
                                   nullptr, 0, 0, 1, 1, 0.1, false));
}

// One model shared by several threads: every call owns its working storage.
// And splitting one call across threads changes nothing: outputs, flags and
// status are the same bit for bit as on one thread, for both forms, with
// failing points; a model's exception reaches the caller from any thread.
TEST(MathModelCore, ConcurrentCallsAndThreadCountDoNotChangeResults) {
    SmoothModel oModel;
    oModel.mdfFailFromPixel = 803.5;
    const int nCols = 900;
    const int nRows = 350;
    std::vector<float> afZ = Terrain(nCols, nRows);
    afZ[200 * nCols + 33] = kNullF;
    std::vector<double> adfIn(100000);
    for (std::size_t i = 0; i < adfIn.size(); ++i) adfIn[i] = 0.021 * static_cast<double>(i);
    // The statuses of three calls (two block forms, one array form), and every
    // output and flag they wrote, in order.
    using Run = std::pair<std::vector<int>, std::vector<double>>;
    auto Evaluate = [&] {
        Run o;
        for (const auto& [nStep, dfTol] : {std::pair{1, 0.0}, std::pair{32, 0.01}}) {
            Block b(nCols, nRows);
            o.first.push_back(
                ImageToGroundBlock(&oModel, b, nStep, afZ.data(), -50.0, -30.0, 1.0, 1.0, dfTol));
            o.second.insert(o.second.end(), b.afOut1.begin(), b.afOut1.end());
            o.second.insert(o.second.end(), b.afOut2.begin(), b.afOut2.end());
            o.second.insert(o.second.end(), b.abyValid.begin(), b.abyValid.end());
        }
        std::vector<double> adfX(adfIn.size()), adfY(adfIn.size());
        std::vector<int> anValid(adfIn.size());
        o.first.push_back(nm::ImageToGround(&oModel, 12.5, 40.0, static_cast<int>(adfIn.size()),
                                            adfIn.data(), adfX.data(), adfY.data(), anValid.data(),
                                            false));
        for (const auto* padf : {&adfX, &adfY})
            o.second.insert(o.second.end(), padf->begin(), padf->end());
        o.second.insert(o.second.end(), anValid.begin(), anValid.end());
        return o;
    };
    auto ExpectSame = [](const Run& a, const Run& b) {
        EXPECT_EQ(a.first, b.first);
        ASSERT_EQ(a.second.size(), b.second.size());
        EXPECT_EQ(0, std::memcmp(a.second.data(), b.second.data(), a.second.size() * 8));
    };
    nova::SetEvaluationThreads(1);
    const Run oOne = Evaluate();
    EXPECT_EQ(std::vector<int>(3, -1), oOne.first);
    nova::SetEvaluationThreads(3);
    ExpectSame(oOne, Evaluate());
    std::vector<Run> aoRuns(3);
    std::vector<std::thread> aoThreads;
    for (Run& oRun : aoRuns) aoThreads.emplace_back([&] { oRun = Evaluate(); });
    for (auto& oThread : aoThreads) oThread.join();
    for (const Run& oRun : aoRuns) ExpectSame(oOne, oRun);

    nova::SetEvaluationThreads(4);
    ThrowingModel oThrowing;
    Block oOut(20, 20);
    EXPECT_THROW(ImageToGroundBlock(&oThrowing, oOut, 8, nullptr, 0, 0, 1, 1, 0.1),
                 std::runtime_error);
    std::vector<double> adfX(adfIn.size()), adfY(adfIn.size());
    EXPECT_THROW(nm::ImageToGround(&oThrowing, 0.0, 0.0, static_cast<int>(adfIn.size()),
                                   adfIn.data(), adfX.data(), adfY.data(), nullptr, false),
                 std::runtime_error);

    // Counts outside 0..256 are refused by name and leave the setting alone.
    WarningCapture oCapture;
    nova::SetEvaluationThreads(-2);
    nova::SetEvaluationThreads(257);
    EXPECT_EQ(4, nova::GetEvaluationThreads());
    ASSERT_EQ(2u, oCapture.maoReports.size());
    EXPECT_NE(std::string::npos, oCapture.maoReports[0].osText.find("-2"));
    EXPECT_NE(std::string::npos, oCapture.maoReports[1].osText.find("257"));
    nova::SetEvaluationThreads(0);
    EXPECT_GE(nova::GetEvaluationThreads(), 1);
}
