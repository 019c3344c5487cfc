// Generic dispatch by model code.
#include <gtest/gtest.h>


#include "lumo.h"
#include "mathmodel_core.h"
#include "support/model_stubs.h"

namespace {

using nova::mathmodel::IMathModel;

// A model object that records its point calls and fails on request.
class RecordingModel : public lumo::support::StubModel {
  public:
    RecordingModel() : StubModel("recording", nova::mathmodel::MM_TYPE_USER, 0, 0, true) {}

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
