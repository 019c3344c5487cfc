// A math model object over a shared model record of any family, evaluated
// through the generic dispatch.

#include "lumo_record_model.h"

#include <cmath>
#include <string>
#include <utility>

#include "lumo_dispatch.h"
#include "nova/runtime.h"

namespace nova {
namespace mathmodel {
namespace {

constexpr const char* kSourceFile = "mathmodel/lumo/record_model.cpp";

[[noreturn]] void ThrowParameter(const char* pszName, const std::string& osMessage, int nLine) {
    throw ParameterException(pszName, 1, "", "", osMessage, kSourceFile,
                             "nova::mathmodel::CreateRecordMathModel", nLine);
}

class RecordMathModel final : public PointMathModel {
  public:
    using PointMathModel::GroundToImage;
    using PointMathModel::ImageToGround;

    RecordMathModel(int nModelCode, std::shared_ptr<void> poRecord, ogc::CRSPtr poCRS, int nPixels,
                    int nLines)
        : mnModelCode(nModelCode),
          mpoRecord(std::move(poRecord)),
          mpoCRS(std::move(poCRS)),
          mnPixels(nPixels),
          mnLines(nLines) {}

    const ogc::cs::ICRS* GetCRS() const override { return mpoCRS.get(); }
    MathModelType GetModelType() const override { return MM_TYPE_LUMO; }
    std::string GetModelName() const override { return "Lumo"; }
    int GetNumColumns() const override { return mnPixels; }
    int GetNumRows() const override { return mnLines; }
    int GetDownsampleFactor() const override { return 1; }
    int GetMinValidHeight(double&) const override { return -1; }
    int GetMaxValidHeight(double&) const override { return -1; }
    bool IsHeightDependent() const override { return true; }
    bool IsEqual(const IMathModel* poOther) const override { return poOther == this; }
    IMathModel* Clone() const override {
        return new RecordMathModel(mnModelCode, mpoRecord, ogc::CRSPtr(mpoCRS->Clone()), mnPixels,
                                   mnLines);
    }
    void SetDownsampleFactor(int) override {}

    int ImageToGround(double dfPixel, double dfLine, double dfZ, double& dfX, double& dfY,
                      bool) const override {
        double dfOutX = 0.0;
        double dfOutY = 0.0;
        if (GenImg2Geo(mnModelCode, mpoRecord.get(), dfPixel, dfLine, dfZ, &dfOutX, &dfOutY) != 1 ||
            !std::isfinite(dfOutX) || !std::isfinite(dfOutY)) {
            return -1;
        }
        dfX = dfOutX;
        dfY = dfOutY;
        return 0;
    }
    int GroundToImage(double dfX, double dfY, double dfZ, double& dfPixel, double& dfLine,
                      bool) const override {
        double dfOutPixel = 0.0;
        double dfOutLine = 0.0;
        if (GenGeo2Img(mnModelCode, mpoRecord.get(), dfX, dfY, dfZ, &dfOutPixel, &dfOutLine) != 1 ||
            !std::isfinite(dfOutPixel) || !std::isfinite(dfOutLine)) {
            return -1;
        }
        dfPixel = dfOutPixel;
        dfLine = dfOutLine;
        return 0;
    }

  private:
    int mnModelCode;
    std::shared_ptr<void> mpoRecord;
    ogc::CRSPtr mpoCRS;
    int mnPixels;
    int mnLines;
};

}  // namespace

IMathModel* CreateRecordMathModel(int nModelCode, std::shared_ptr<void> poRecord,
                                  const ProjInfo_t& sProjection, ogc::cs::DatumType eVertical,
                                  int nPixels, int nLines) {
    if (!poRecord) ThrowParameter("poRecord", "null model record", __LINE__);
    if (nModelCode < LUMO_CODE_AP || nModelCode > LUMO_CODE_RTCS) {
        ThrowParameter("nModelCode", FormatString("model code %d is not 1 to 7", nModelCode),
                       __LINE__);
    }
    if (nPixels < 0 || nLines < 0) {
        ThrowParameter("nPixels", FormatString("invalid image size %d x %d", nPixels, nLines),
                       __LINE__);
    }
    ogc::CRSPtr poHorizontal(ogc::utils::ProjInfoToCRS(sProjection));
    if (!poHorizontal) {
        ThrowParameter(
            "sProjection",
            std::string("no coordinate system for the projection \"") + sProjection.szProj + "\"",
            __LINE__);
    }
    ogc::CRSPtr poCRS(ogc::utils::CreateCompoundCS(poHorizontal.get(), eVertical));
    return new RecordMathModel(nModelCode, std::move(poRecord), std::move(poCRS), nPixels, nLines);
}

}  // namespace mathmodel
}  // namespace nova
