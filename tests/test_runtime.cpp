// Runtime services: allocation, numbered errors, scanning, debug log,
// exceptions and 3-D helpers.
#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <limits>
#include <memory>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "runtime.h"
#include "support/numbered_error.h"
#include "support/warnings.h"

namespace {

using lumo::support::WarningCapture;

TEST(Runtime, AllocationNeverReturnsNullAndFreeAcceptsIt) {
    std::unique_ptr<char, nova::FreeDeleter> pZero(static_cast<char*>(HMalloc(0)));
    EXPECT_NE(pZero.get(), nullptr);

    auto* padf = static_cast<double*>(HCalloc(1000, sizeof(double)));
    for (int i = 0; i < 1000; ++i) EXPECT_EQ(padf[i], 0.0);
    padf[999] = 7.0;
    padf = static_cast<double*>(HRealloc(padf, 4000 * sizeof(double)));
    EXPECT_EQ(padf[999], 7.0);
    std::free(padf);

    // Impossible requests throw instead of returning null, and the count
    // times size product cannot wrap around.
    EXPECT_THROW(HCalloc(std::uint64_t(1) << 40, std::uint64_t(1) << 40),
                 nova::OutOfMemoryException);
    try {
        HMalloc(std::numeric_limits<std::uint64_t>::max());
        ADD_FAILURE() << "no exception";
    } catch (const nova::OutOfMemoryException& e) {
        EXPECT_NE(std::string(e.what()).find("18446744073709551615"), std::string::npos);
    }
}

TEST(Runtime, FatalErrorsThrowWithNumberAndTextWarningsAreCounted) {
    using lumo::support::FatalOf;
    const auto oSingular =
        FatalOf([] { IMPError(100, 1, _("Matrix is singular. Please check your GCPs.")); });
    EXPECT_EQ(oSingular.first, 100);
    EXPECT_NE(oSingular.second.find("Matrix is singular"), std::string::npos);
    EXPECT_NE(oSingular.second.find("100"), std::string::npos);
    EXPECT_EQ(FatalOf([] { IMPErrChar(19, 1, "Satellite Sensor", "NOSUCH"); }).first, 19);
    const auto oReal = FatalOf([] { IMPErrReal(32, 1, "Earth model", -0.5, 2); });
    EXPECT_EQ(oReal.first, 32);
    EXPECT_NE(oReal.second.find("Earth model"), std::string::npos);
    EXPECT_NE(oReal.second.find("-0.5"), std::string::npos);

    WarningCapture oCapture;
    nova::ResetWarningCount();
    IMPErrMsg(11, 0);
    IMPErrChar(189, 0, "X_img", "12345");
    IMPErrReal(189, 0, "Y_img", 3.5, 7);
    EXPECT_EQ(nova::GetWarningCount(), 3u);
    ASSERT_EQ(oCapture.maoReports.size(), 3u);
    EXPECT_EQ(oCapture.maoReports[0].nCode, 11);
    EXPECT_FALSE(oCapture.maoReports[0].bFatal);
    EXPECT_NE(oCapture.maoReports[1].osText.find("X_img"), std::string::npos);
    EXPECT_NE(oCapture.maoReports[2].osText.find("(7)"), std::string::npos);
    EXPECT_EQ(nova::GetLastErrorReport().nCode, 189);

    // Every catalogue number has wording of its own.
    std::set<std::string> oTexts;
    for (int nCode : {11, 19, 32, 100, 189}) oTexts.insert(nova::ErrorCatalogueText(nCode));
    EXPECT_EQ(oTexts.size(), 5u);
    EXPECT_STREQ(nova::ErrorCatalogueText(12345), "Unknown error");

    // Null texts are tolerated.
    IMPError(11, 0, nullptr);
    IMPErrChar(11, 0, nullptr, nullptr);
    EXPECT_EQ(nova::GetWarningCount(), 5u);
}

TEST(Runtime, FormattingAndNames) {
    EXPECT_EQ(nova::FormatString("%d-%s-%.2f", 7, "x", 1.5), "7-x-1.50");
    const std::string osLong(1000, 'a');
    EXPECT_EQ(nova::FormatString("%s!", osLong.c_str()), osLong + "!");

    // Names stay valid while the thread makes fewer than 16 more.
    const char* pszFirst = MkName("Illegal nType (%d) passed to TRNAllocate().", -7);
    std::vector<const char*> apszMore;
    for (int i = 0; i < 10; ++i) apszMore.push_back(MkName("n%d", i));
    EXPECT_STREQ(pszFirst, "Illegal nType (-7) passed to TRNAllocate().");
    EXPECT_STREQ(apszMore[9], "n9");
}

TEST(Runtime, ScanningFixedWidthFields) {
    // Adjacent fields without terminators.
    const char achHeader[] = "   42-17 3.25E+021.5D-3      ";
    EXPECT_EQ(ScanInt(achHeader, 5), 42);
    EXPECT_EQ(ScanInt(achHeader + 5, 3), -17);
    EXPECT_DOUBLE_EQ(ScanDouble(achHeader + 8, 9), 325.0);
    EXPECT_DOUBLE_EQ(ScanDouble(achHeader + 17, 6), 1.5e-3);
    // Blank, empty, malformed and null fields read as 0.
    EXPECT_EQ(ScanInt(achHeader + 23, 6), 0);
    EXPECT_EQ(ScanInt("abc", 3), 0);
    EXPECT_EQ(ScanDouble(nullptr, 4), 0.0);
    EXPECT_EQ(ScanInt("123", 0), 0);
    // The width is respected even when more digits follow.
    EXPECT_EQ(ScanInt("123456", 3), 123);
    // Overflow saturates.
    EXPECT_EQ(ScanInt("99999999999999", 14), std::numeric_limits<int>::max());
    // A terminator before the width ends the field.
    EXPECT_EQ(ScanInt("12", 20), 12);
}

TEST(Runtime, DebugLogHonoursLevelAndSink) {
    lumo::support::DebugCapture oOff(0);
    nova::diag::Debugger::Debug("off", 1, "lumokit", "mathmodel/lumo/poly", 1);
    EXPECT_TRUE(oOff.maoRecords.empty());
    lumo::support::DebugCapture oOn(1);
    nova::diag::Debugger::Debug("on", 1, "lumokit", "mathmodel/lumo/poly", 10);
    nova::diag::Debugger::Debug("too detailed", 2, "lumokit", "mathmodel/lumo/poly", 11);
    ASSERT_EQ(oOn.maoRecords.size(), 1u);
    EXPECT_EQ(oOn.maoRecords[0].osMessage, "on");
    EXPECT_EQ(oOn.maoRecords[0].nLine, 10);
}

TEST(Runtime, ExceptionsCarryTheirFieldsAndTheMutexExcludes) {
    try {
        throw nova::ParameterException("eType", 1, "", "", "Unknown model code", "mathmodel/lumo/x",
                                       "void f(int)", 105);
    } catch (const nova::DataException& e) {  // a parameter exception is a data exception
        const auto* pe = dynamic_cast<const nova::ParameterException*>(&e);
        ASSERT_NE(pe, nullptr);
        EXPECT_EQ(pe->GetParameterName(), "eType");
        EXPECT_STREQ(pe->what(), "Unknown model code");
        EXPECT_EQ(pe->GetLine(), 105);
    }
    nova::threading::Mutex oMutex;
    int nCounter = 0;
    std::vector<std::thread> aThreads;
    aThreads.reserve(4);
    for (int t = 0; t < 4; ++t) {
        aThreads.emplace_back([&] {
            for (int i = 0; i < 1000; ++i) {
                std::lock_guard<nova::threading::Mutex> oLock(oMutex);
                ++nCounter;
            }
        });
    }
    for (auto& oThread : aThreads) oThread.join();
    EXPECT_EQ(nCounter, 4000);
}

// The products' plain values are the orbit model's to get right (its tests
// fail when one is wrong); what only this test sees is an output that is
// also an input, and the zero vector.
TEST(Runtime, VectorAndMatrixHelpersAllowAliasing) {
    double a[3] = {1, 2, 3}, b[3] = {-2, 0.5, 4}, c[3], d[3] = {1, 2, 3};
    CrossProduct(a, b, c);
    CrossProduct(d, b, d);  // output aliasing an input
    for (int i = 0; i < 3; ++i) EXPECT_DOUBLE_EQ(d[i], c[i]);
    VecDiff(a, b, c);
    EXPECT_DOUBLE_EQ(c[1], 1.5);
    double e[3] = {3, 0, 4}, z[3] = {0, 0, 0};
    EXPECT_DOUBLE_EQ(VecLength(e), 5.0);
    VecNormalize(e);
    EXPECT_DOUBLE_EQ(e[2], 0.8);
    VecNormalize(z);  // no NaN from a zero vector
    EXPECT_EQ(z[0], 0.0);

    // Rotation about Z by 90 degrees, its transpose, and its square in place.
    const double m[9] = {0, -1, 0, 1, 0, 0, 0, 0, 1};
    double v[3] = {1, 0, 0};
    MV3_Mult(m, v, v);
    EXPECT_DOUBLE_EQ(v[1], 1.0);
    MtV3_Mult(m, v, v);
    EXPECT_DOUBLE_EQ(v[0], 1.0);
    double self[9] = {0, -1, 0, 1, 0, 0, 0, 0, 1};
    MM3_Mult(self, self, self);
    for (int i = 0; i < 9; ++i)
        EXPECT_DOUBLE_EQ(self[i], i == 0 || i == 4 ? -1.0 : i == 8 ? 1.0 : 0.0);
}

}  // namespace
