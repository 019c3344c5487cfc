// The math model object over polynomial records, and the generic dispatch by
// model code.

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "lumo.h"
#include "nova/crs.h"
#include "nova/projection.h"
#include "nova/runtime.h"
#include "support/model_records.h"
#include "support/model_stubs.h"
#include "support/warnings.h"

namespace nova {
namespace mathmodel {

// Reaches the object's private helpers and flags.
struct LumoMathModelTestAccess {
    static int GetNumGridPoints(const LumoMathModel& m, int nSize, int nStep) {
        return m.GetNumGridPoints(nSize, nStep);
    }
    static void SetThreadSafe(LumoMathModel& m, bool bSafe) { m.mbThreadSafe = bSafe; }
    static bool HasMutex(const LumoMathModel& m) { return m.mpoMutex != nullptr; }
    static void SetModelCode(LumoMathModel& m, int nCode) { m.mnModelCode = nCode; }
    static void SetType(LumoMathModel& m, LumoModelType eType) { m.meType = eType; }
    static int I2GBlockSimple(const LumoMathModel& m) {
        return m.I2GBlockSimple(1, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, 0, 0, 1, 1,
                                0, false);
    }
};

}  // namespace mathmodel
}  // namespace nova

namespace {

namespace nm = nova::mathmodel;
using Access = nm::LumoMathModelTestAccess;

constexpr const char* kFile = "mathmodel/lumo/lumokit";
constexpr const char* kUnknownModel =
    "Unknown model, only Toutin, Polynomial, Thin plate spline, ADS, and Radar models are "
    "supported";
constexpr const char* kNotThreadSafe =
    "Internal error: math model marked as non-threadsafe, but implementation not defined";

using lumo::support::PolyPtr;

// An affine UTM model: about 10 m pixels over a 6000 x 5000 image.
PolyPtr MakePoly(const char* pszGeosys = "UTM 31 U D000") {
    PolyPtr poly(POLYAllocate());
    poly->nCoeffs = 3;
    poly->nPixels = 6000;
    poly->nLines = 5000;
    const std::pair<double*, std::array<double, 3>> aCoeffs[] = {
        {poly->padfPixelCoeffs, {-44000.0, 0.1, 0.0}},
        {poly->padfLineCoeffs, {572000.0, 0.0, -0.1}},
        {poly->padfXCoeffs, {440000.0, 10.0, 0.0}},
        {poly->padfYCoeffs, {5720000.0, 0.0, -10.0}}};
    for (const auto& [padf, adf] : aCoeffs) std::copy(adf.begin(), adf.end(), padf);
    std::strncpy(poly->pszGeosys, pszGeosys, POLY_GEOSYS_SIZE - 1);
    Geosys2ProjInfo(poly->psProjInfo, pszGeosys, 0.0, 0.0, 1.0, 1.0);
    return poly;
}

// Pixel and line of a ground point through the object's point form; NaN when
// the call fails.
std::pair<double, double> ToImage(const nm::IMathModel& m, double x, double y, double z) {
    double pixel = 0.0, line = 0.0;
    if (m.GroundToImage(x, y, z, pixel, line, false) != 0) return {NAN, NAN};
    return {pixel, line};
}

// Runs `f`, which must throw E itself (a data exception must not be a
// parameter exception), and checks the exception's message, file and line.
template <typename E, typename F>
std::optional<E> Catch(F f, const std::string& message, int line) {
    try {
        f();
    } catch (const E& e) {
        EXPECT_EQ(dynamic_cast<const nova::ParameterException*>(&e) != nullptr,
                  (std::is_same<E, nova::ParameterException>::value));
        EXPECT_EQ(e.GetMessage(), message);
        EXPECT_EQ(e.GetFile(), kFile);
        EXPECT_EQ(e.GetLine(), line);
        return e;
    }
    ADD_FAILURE() << "no exception: " << message;
    return std::nullopt;
}

// The same for a parameter exception, which also names the parameter.
void CatchParameter(const std::function<void()>& f, const char* name, const std::string& message,
                    int line) {
    const auto e = Catch<nova::ParameterException>(f, message, line);
    EXPECT_TRUE(e && e->GetParameterName() == name) << name;
}

// A model object of any type that records its point calls and fails on
// request.
class RecordingModel : public lumo::support::StubModel {
  public:
    explicit RecordingModel(nm::MathModelType eType = nm::MM_TYPE_USER)
        : StubModel("recording", eType, 0, 0, true) {}

    mutable int mnImageToGround = 0;
    mutable int mnGroundToImage = 0;
    mutable double mdfLastZ = 0.0;
    int mnResult = 0;

    using StubModel::GroundToImage;
    using StubModel::ImageToGround;
    int ImageToGround(double dfPixel, double dfLine, double dfZ, double& dfX, double& dfY,
                      bool) const override {
        ++mnImageToGround;
        mdfLastZ = dfZ;
        dfX = dfPixel * 2.0;
        dfY = dfLine * 3.0;
        return mnResult;
    }
    int GroundToImage(double dfX, double dfY, double dfZ, double& dfPixel, double& dfLine,
                      bool) const override {
        ++mnGroundToImage;
        mdfLastZ = dfZ;
        dfPixel = dfX / 2.0;
        dfLine = dfY / 3.0;
        return mnResult;
    }
    IMathModel* Clone() const override { return new RecordingModel(*this); }
};

TEST(LumoMathModel, ConstructorsWrapOwnCopyWithCompoundCrs) {
    PolyPtr poly = MakePoly();
    nm::LumoMathModel byCode(4, poly.get());
    nm::LumoMathModel byType(nm::LUMO_MODEL_POLY, poly.get());
    for (const nm::LumoMathModel* m : {&byCode, &byType}) {
        EXPECT_EQ(m->GetLumoModelType(), nm::LUMO_MODEL_POLY);
        EXPECT_EQ(m->GetNumColumns(), 6000);
        EXPECT_EQ(m->GetNumRows(), 5000);
        EXPECT_NE(m->GetModel(), poly.get());
        const nova::ogc::cs::ICRS* crs = m->GetCRS();
        ASSERT_NE(crs, nullptr);
        EXPECT_TRUE(crs->IsCompound() && crs->IsProjected());
        EXPECT_EQ(crs->GetVerticalDatumType(), nova::ogc::cs::CS_VD_Ellipsoidal);
    }
    // The caller's record stays the caller's: changing it does not change the object.
    const auto before = ToImage(byCode, 450000.0, 5700000.0, 0.0);
    poly->padfPixelCoeffs[0] = 0.0;
    EXPECT_EQ(ToImage(byCode, 450000.0, 5700000.0, 0.0), before);
    PolyPtr geographic = MakePoly("LONG/LAT D000");
    EXPECT_TRUE(nm::LumoMathModel(4, geographic.get()).GetCRS()->IsGeographic());
}

TEST(LumoMathModel, ConstructionFailuresThrowExactExceptions) {
    PolyPtr poly = MakePoly();
    CatchParameter([&] { nm::LumoMathModel m(1, poly.get()); }, "eType", kUnknownModel, 466);
    CatchParameter([] { nm::LumoMathModel m(4, nullptr); }, "pData", "null pointer", 312);
    Catch<nova::ParameterException>([&] { nm::LumoMathModel m(nm::LUMO_MODEL_CODE11, poly.get()); },
                                    "Unknown model code passed to LumoMathModel constructor", 105);
    // Types and codes the object does not wrap are parameter errors too.
    for (nm::LumoModelType t : {nm::LUMO_MODEL_AP, nm::LUMO_MODEL_RF, nm::LUMO_MODEL_CODE12}) {
        EXPECT_THROW(nm::LumoMathModel(t, poly.get()), nova::ParameterException) << t;
    }
    for (int code : {-1, 0, 6, 8, 9, 13}) {
        EXPECT_THROW(nm::LumoMathModel(code, poly.get()), nova::ParameterException) << code;
    }
    // Unit-only and unreadable descriptions have no CRS: a data exception,
    // not a parameter exception.
    for (const char* geosys : {"METRE", "PIXEL", "NOT A PROJ"}) {
        PolyPtr bad = MakePoly(geosys);
        Catch<nova::DataException>([&] { nm::LumoMathModel m(4, bad.get()); },
                                   "Failed to get a CRS for the math model!", 473);
    }
}

TEST(LumoMathModel, CopiesClonesAndEquality) {
    PolyPtr poly = MakePoly();
    nm::LumoMathModel original(4, poly.get());
    nm::LumoMathModel copy(original);
    std::unique_ptr<nm::IMathModel> clone(original.Clone());
    auto* lumoClone = dynamic_cast<nm::LumoMathModel*>(clone.get());
    ASSERT_NE(lumoClone, nullptr);
    for (const nm::LumoMathModel* m : {static_cast<const nm::LumoMathModel*>(&copy),
                                       static_cast<const nm::LumoMathModel*>(lumoClone)}) {
        EXPECT_NE(m->GetModel(), original.GetModel());
        EXPECT_NE(m->GetCRS(), original.GetCRS());
        EXPECT_EQ(ToImage(*m, 455000.0, 5690000.0, 10.0),
                  ToImage(original, 455000.0, 5690000.0, 10.0));
        EXPECT_FALSE(Access::HasMutex(*m));
    }

    EXPECT_TRUE(original.IsEqual(&original));
    EXPECT_FALSE(original.IsEqual(clone.get()));
    EXPECT_FALSE(original.IsEqual(nullptr));
    RecordingModel foreignLumo(nm::MM_TYPE_LUMO);
    EXPECT_FALSE(original.IsEqual(&foreignLumo));

    // A copy of an object that is not thread-safe gets its own mutex and
    // keeps the flag.
    Access::SetThreadSafe(original, false);
    nm::LumoMathModel unsafeCopy(original);
    EXPECT_TRUE(Access::HasMutex(unsafeCopy));
    std::unique_ptr<nm::IMathModel> unsafeClone(unsafeCopy.Clone());
    EXPECT_TRUE(Access::HasMutex(*dynamic_cast<nm::LumoMathModel*>(unsafeClone.get())));
    double p = 0, l = 0;
    EXPECT_EQ(unsafeCopy.GroundToImage(455000.0, 5690000.0, 0.0, p, l, false), -1);
}

TEST(LumoMathModel, SizesHeightsDownsampleAndGridPoints) {
    PolyPtr poly = MakePoly();
    nm::LumoMathModel m(4, poly.get());
    double h = 123.5;
    EXPECT_EQ(m.GetMinValidHeight(h), -1);
    EXPECT_EQ(m.GetMaxValidHeight(h), -1);
    EXPECT_EQ(h, 123.5);
    Catch<nova::DataException>([&] { m.SetDownsampleFactor(2); },
                               "Downsample factor not supported for the current model type", 1277);
    EXPECT_EQ(m.GetDownsampleFactor(), 2);  // stored before the check
    EXPECT_NO_THROW(m.SetDownsampleFactor(1));

    // A type the object never wraps: it cannot be sized, downsampled or copied.
    Access::SetType(m, nm::LUMO_MODEL_RF);
    EXPECT_THROW((void)m.GetNumColumns(), nova::ParameterException);
    EXPECT_THROW((void)m.GetNumRows(), nova::ParameterException);
    EXPECT_THROW(m.SetDownsampleFactor(3), nova::ParameterException);
    EXPECT_THROW((void)nm::LumoMathModel(m).GetModel(), nova::ParameterException);
    Access::SetType(m, nm::LUMO_MODEL_POLY);  // so the record is released

    EXPECT_EQ(Access::GetNumGridPoints(m, 10, 3), 5);
    EXPECT_EQ(Access::GetNumGridPoints(m, 9, 3), 4);
    EXPECT_THROW(Access::GetNumGridPoints(m, 10, 0), nova::ParameterException);
}

TEST(LumoMathModel, PointOperationsMatchFamilyAndNeverThrow) {
    PolyPtr poly = MakePoly();
    nm::LumoMathModel m(4, poly.get());
    EXPECT_EQ(ToImage(m, 450000.0, 5700000.0, 55.0), std::make_pair(1000.0, 2000.0));
    double pixel = -1, line = -1, x = 0, y = 0;
    ASSERT_EQ(m.ImageToGround(1000.0, 2000.0, 55.0, x, y, false), 0);
    EXPECT_DOUBLE_EQ(x, 450000.0);
    EXPECT_DOUBLE_EQ(y, 5700000.0);

    // A failing family (here: a code the dispatch refuses) gives -1 and
    // leaves the outputs alone.
    Access::SetModelCode(m, 8);
    pixel = line = 7.0;
    EXPECT_EQ(m.GroundToImage(450000.0, 5700000.0, 0.0, pixel, line, false), -1);
    EXPECT_EQ(m.ImageToGround(1.0, 2.0, 0.0, pixel, line, false), -1);
    EXPECT_EQ(pixel, 7.0);
    EXPECT_EQ(line, 7.0);
    Access::SetModelCode(m, 4);
}

TEST(LumoMathModel, NotThreadSafeObjectLogsAndThrowsFromBlocks) {
    PolyPtr poly = MakePoly();
    nm::LumoMathModel m(4, poly.get());
    Access::SetThreadSafe(m, false);
    double a = 5, b = 6;
    std::vector<nova::diag::DebugRecord> records;
    {
        lumo::support::DebugCapture oLog(1);
        EXPECT_EQ(m.GroundToImage(1.0, 2.0, 0.0, a, b, false), -1);
        EXPECT_EQ(m.ImageToGround(1.0, 2.0, 0.0, a, b, false), -1);
        nova::diag::Debugger::SetDebugLevel(0);
        EXPECT_EQ(m.ImageToGround(1.0, 2.0, 0.0, a, b, false), -1);  // silent at level 0
        records = oLog.maoRecords;
    }
    EXPECT_EQ(a, 5);
    EXPECT_EQ(b, 6);
    ASSERT_EQ(records.size(), 2u);
    EXPECT_EQ(records[0].osMessage, "GenGeo2Img failed for type 4, the results may be hosed");
    EXPECT_EQ(records[0].nLine, 695);
    EXPECT_EQ(records[1].osMessage, "GenImg2Geo failed for type 4, the results may be invalid");
    EXPECT_EQ(records[1].nLine, 655);
    for (const auto& r : records) {
        EXPECT_EQ(r.osModule, "lumokit");
        EXPECT_EQ(r.osFile, kFile);
    }

    float in[1] = {0}, out1[1] = {0}, out2[1] = {0};
    Catch<nova::Exception>(
        [&] {
            m.GroundToImage(1, 1, 1, in, in, nullptr, out1, out2, nullptr, 0, 0, 1, 1, 0, false);
        },
        kNotThreadSafe, 777);
    EXPECT_THROW(
        m.ImageToGround(1, 1, 1, in, in, nullptr, out1, out2, nullptr, 0, 0, 1, 1, 0, false),
        nova::Exception);
    // The private block helpers only report the missing implementation.
    Catch<nova::Exception>([&] { Access::I2GBlockSimple(m); }, kNotThreadSafe, 1042);
}

TEST(LumoMathModel, BlockSlotsForwardToHostFunctions) {
    PolyPtr poly = MakePoly();
    nm::LumoMathModel m(4, poly.get());
    // A regular 5 x 4 grid, evaluated exactly (tolerance 0) both ways.
    const int cols = 5, rows = 4;
    std::vector<float> pa(cols * rows), la(cols * rows);
    std::vector<unsigned char> va(cols * rows);
    EXPECT_EQ(m.GroundToImage(cols, rows, 1, nullptr, nullptr, nullptr, pa.data(), la.data(),
                              va.data(), 450000.0, 5700000.0, 100.0, -100.0, 0.0, false),
              0);
    EXPECT_FLOAT_EQ(pa[cols + 2], 1000.0f + 20.0f);
    EXPECT_FLOAT_EQ(la[cols + 2], 2000.0f + 10.0f);
    EXPECT_EQ(m.ImageToGround(cols, rows, 1, nullptr, nullptr, nullptr, pa.data(), la.data(),
                              va.data(), 0.0, 0.0, 10.0, 10.0, 0.0, false),
              0);
    EXPECT_FLOAT_EQ(pa[cols * 3 + 4], 440000.0f + 400.0f);
    EXPECT_FLOAT_EQ(la[cols * 3 + 4], 5720000.0f - 300.0f);
    // Bad block arguments are the host's to refuse.
    EXPECT_EQ(m.GroundToImage(cols, rows, 0, nullptr, nullptr, nullptr, pa.data(), la.data(),
                              nullptr, 0.0, 0.0, 1.0, 1.0, 0.0, false),
              -1);
}

TEST(Dispatch, UnknownCodesAndNullRecordsFailWithoutTouchingAnything) {
    double dfPixel = 11.0, dfLine = 22.0, dfZ = 5.0;
    // The model pointer is not looked at for unknown codes; a null record of
    // a known family is refused before it is read.
    void* pBogus = reinterpret_cast<void*>(0x1);
    for (int nCode : {-5, 0, 8, 13, 1000}) {
        EXPECT_EQ(GenGeo2Img(nCode, pBogus, 1, 2, 3, &dfPixel, &dfLine), 0) << nCode;
        EXPECT_EQ(GenImg2GeoDem(nCode, pBogus, 1, 2, &dfZ, &dfPixel, &dfLine), 0) << nCode;
        EXPECT_EQ(static_cast<int>(nova::mathmodel::ModelCodeToLumoType(nCode)), -1) << nCode;
    }
    EXPECT_EQ(GenGeo2Img(9, pBogus, 1, 2, 3, &dfPixel, &dfLine), 0);  // image to ground only
    for (int nCode : {1, 2, 3, 5, 6, 7}) {
        EXPECT_EQ(GenGeo2Img(nCode, nullptr, 1, 2, 3, &dfPixel, &dfLine), 0) << nCode;
        EXPECT_EQ(GenImg2Geo(nCode, nullptr, 1, 2, 3, &dfPixel, &dfLine), 0) << nCode;
    }
    EXPECT_EQ(dfPixel, 11.0);
    EXPECT_EQ(dfLine, 22.0);
    EXPECT_EQ(dfZ, 5.0);
}

TEST(Dispatch, ModelObjectCodes) {
    RecordingModel oModel;
    double dfA = 0, dfB = 0;
    for (int nCode : {10, 11, 12}) {
        EXPECT_EQ(GenGeo2Img(nCode, &oModel, 8.0, 9.0, 100.0, &dfA, &dfB), 1);
        EXPECT_EQ(dfA, 4.0);
        EXPECT_EQ(dfB, 3.0);
        EXPECT_EQ(oModel.mdfLastZ, 100.0);
    }
    for (int nCode : {9, 10, 11, 12}) {
        double dfZ = 50.0;
        EXPECT_EQ(GenImg2GeoDem(nCode, &oModel, 1.0, 2.0, &dfZ, &dfA, &dfB), 1);
        EXPECT_EQ(dfA, 2.0);
        EXPECT_EQ(dfB, 6.0);
        EXPECT_EQ(oModel.mdfLastZ, 50.0);
        // A null height never reaches the object.
        dfZ = LUMO_NULL_VALUE;
        const int nCalls = oModel.mnImageToGround;
        EXPECT_EQ(GenImg2GeoDem(nCode, &oModel, 1.0, 2.0, &dfZ, &dfA, &dfB), 0);
        EXPECT_EQ(GenImg2Geo(nCode, &oModel, 1.0, 2.0, LUMO_NULL_VALUE, &dfA, &dfB), 0);
        EXPECT_EQ(oModel.mnImageToGround, nCalls);
    }
    EXPECT_EQ(oModel.mnGroundToImage, 3);

    // An object that reports failure makes the dispatch fail.
    oModel.mnResult = -1;
    EXPECT_EQ(GenGeo2Img(10, &oModel, 8.0, 9.0, 0.0, &dfA, &dfB), 0);
    EXPECT_EQ(GenImg2Geo(12, &oModel, 8.0, 9.0, 0.0, &dfA, &dfB), 0);
}

}  // namespace
