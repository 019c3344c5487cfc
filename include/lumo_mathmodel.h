// The math model object: one model record of this library behind the host's
// abstract math-model interface, with the compound CRS of its ground
// coordinates.
#pragma once

#include <string>

#include "lumo_dispatch.h"
#include "lumo_types.h"
#include "nova/mathmodel_core.h"

namespace nova {
namespace threading {
class Mutex;
}  // namespace threading

namespace mathmodel {

// Wraps a deep copy of a polynomial (code 4), thin plate spline (code 5) or
// rigorous (code 2) record. Point operations go through the generic
// dispatch, except a rigorous model's GroundToImage, which is the exact
// inverse of its image-to-ground equations (SRITGeo2ImgExact) so that both
// directions agree; array and block operations go through the host's free
// functions with this object first, and so through the point operations.
class LUMO_API LumoMathModel : public IMathModel {
  public:
    // Throws nova::ParameterException for a type without a model code.
    LumoMathModel(LumoModelType eType, const void* pData);
    // Throws nova::ParameterException for an unsupported code or a null
    // record, nova::DataException when no CRS can be made for the record.
    LumoMathModel(int nModelCode, const void* pData);
    LumoMathModel(const LumoMathModel& oOther);
    // Copies are made only by construction or Clone(): an assignment would
    // have to replace the model, which the object does not allow.
    LumoMathModel& operator=(const LumoMathModel&) = delete;
    ~LumoMathModel() override;

    const nova::ogc::cs::ICRS* GetCRS() const override;
    MathModelType GetModelType() const override;
    std::string GetModelName() const override;
    int GetNumColumns() const override;
    int GetNumRows() const override;
    int GetDownsampleFactor() const override;
    int GetMinValidHeight(double& dfHeight) const override;
    int GetMaxValidHeight(double& dfHeight) const override;
    bool IsHeightDependent() const override;
    bool IsEqual(const IMathModel* poOther) const override;

    int ImageToGround(int nCols, int nRows, int nGridStep, const float* pafPixel,
                      const float* pafLine, const float* pafZ, float* pafX, float* pafY,
                      unsigned char* pabyValid, double dfOriginPixel, double dfOriginLine,
                      double dfStepPixel, double dfStepLine, double dfTolerance,
                      bool bFlag) const override;
    int ImageToGround(double dfLine, double dfZ, int nCount, const double* padfPixel, double* padfX,
                      double* padfY, int* panValid, bool bFlag) const override;
    int ImageToGround(double dfPixel, double dfLine, double dfZ, double& dfX, double& dfY,
                      bool bFlag) const override;

    int GroundToImage(int nCols, int nRows, int nGridStep, const float* pafX, const float* pafY,
                      const float* pafZ, float* pafPixel, float* pafLine, unsigned char* pabyValid,
                      double dfOriginX, double dfOriginY, double dfStepX, double dfStepY,
                      double dfTolerance, bool bFlag) const override;
    int GroundToImage(double dfY, double dfZ, int nCount, const double* padfX, double* padfPixel,
                      double* padfLine, int* panValid, bool bFlag) const override;
    int GroundToImage(double dfX, double dfY, double dfZ, double& dfPixel, double& dfLine,
                      bool bFlag) const override;

    IMathModel* Clone() const override;
    void SetDownsampleFactor(int nFactor) override;

    LumoModelType GetLumoModelType() const;
    // The object's own record (still owned by the object).
    const void* GetModel() const;

  private:
    // Sets no field; not used by the library.
    LumoMathModel();

    void Init();
    void InitModel(int nModelCode, const void* pData);
    void CopyFrom(const LumoMathModel& oOther);
    void ClearModel();
    int GetNumGridPoints(int nSize, int nStep) const;

    int G2IBlockGrid(int nCols, int nRows, int nGridStep, const float* pafX, const float* pafY,
                     const float* pafZ, float* pafPixel, float* pafLine, unsigned char* pabyValid,
                     double dfOriginX, double dfOriginY, double dfStepX, double dfStepY,
                     double dfTolerance, bool bFlag) const;
    int G2IBlockSimple(int nCount, const float* pafX, const float* pafY, const float* pafZ,
                       float* pafPixel, float* pafLine, unsigned char* pabyValid, double dfOriginX,
                       double dfOriginY, double dfStepX, double dfStepY, double dfTolerance,
                       bool bFlag) const;
    int I2GBlockGrid(int nCols, int nRows, int nGridStep, const float* pafPixel,
                     const float* pafLine, const float* pafZ, float* pafX, float* pafY,
                     unsigned char* pabyValid, double dfOriginPixel, double dfOriginLine,
                     double dfStepPixel, double dfStepLine, double dfTolerance, bool bFlag) const;
    int I2GBlockSimple(int nCount, const float* pafPixel, const float* pafLine, const float* pafZ,
                       float* pafX, float* pafY, unsigned char* pabyValid, double dfOriginPixel,
                       double dfOriginLine, double dfStepPixel, double dfStepLine,
                       double dfTolerance, bool bFlag) const;

    // Lets the test suite reach the private helpers and flags.
    friend struct LumoMathModelTestAccess;

    void* mpData;
    LumoModelType meType;
    int mnModelCode;
    nova::ogc::cs::ICRS* mpoCRS;
    int mnDownsampleFactor;
    bool mbThreadSafe;
    nova::threading::Mutex* mpoMutex;
};

}  // namespace mathmodel
}  // namespace nova
