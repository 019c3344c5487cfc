// Stand-in math models for tests and benchmarks of code that takes any
// IMathModel: a base that answers every query with a fixed description and
// fails every operation, so a stub overrides only what it exercises.
#pragma once

#include <cmath>
#include <cstddef>
#include <string>
#include <utility>
#include <vector>

#include "nova/mathmodel_core.h"

namespace lumo {
namespace support {

namespace nm = nova::mathmodel;

// No CRS, no height range, no downsampling; equal only to itself. Every
// transform returns -1 until a subclass overrides it.
class StubModel : public nm::IMathModel {
  public:
    StubModel(std::string osName, nm::MathModelType eType, int nColumns, int nRows,
              bool bHeightDependent)
        : mosName(std::move(osName)),
          meType(eType),
          mnColumns(nColumns),
          mnRows(nRows),
          mbHeightDependent(bHeightDependent) {}

    const nova::ogc::cs::ICRS* GetCRS() const override { return nullptr; }
    nm::MathModelType GetModelType() const override { return meType; }
    std::string GetModelName() const override { return mosName; }
    int GetNumColumns() const override { return mnColumns; }
    int GetNumRows() const override { return mnRows; }
    int GetDownsampleFactor() const override { return 1; }
    int GetMinValidHeight(double&) const override { return -1; }
    int GetMaxValidHeight(double&) const override { return -1; }
    bool IsHeightDependent() const override { return mbHeightDependent; }
    bool IsEqual(const IMathModel* poOther) const override { return poOther == this; }

    int ImageToGround(int, int, int, const float*, const float*, const float*, float*, float*,
                      unsigned char*, double, double, double, double, double, bool) const override {
        return -1;
    }
    int ImageToGround(double, double, int, const double*, double*, double*, int*,
                      bool) const override {
        return -1;
    }
    int ImageToGround(double, double, double, double&, double&, bool) const override { return -1; }
    int GroundToImage(int, int, int, const float*, const float*, const float*, float*, float*,
                      unsigned char*, double, double, double, double, double, bool) const override {
        return -1;
    }
    int GroundToImage(double, double, int, const double*, double*, double*, int*,
                      bool) const override {
        return -1;
    }
    int GroundToImage(double, double, double, double&, double&, bool) const override { return -1; }

    void SetDownsampleFactor(int) override {}

  private:
    std::string mosName;
    nm::MathModelType meType;
    int mnColumns;
    int mnRows;
    bool mbHeightDependent;
};

// A stub whose array and block forms, in both directions, go through the
// host's generic evaluation of the point operations, as a real model's do.
class PointDrivenModel : public StubModel {
  public:
    using StubModel::GroundToImage;
    using StubModel::ImageToGround;
    using StubModel::StubModel;

    int ImageToGround(int nCols, int nRows, int nStep, const float* pafA, const float* pafB,
                      const float* pafZ, float* pafOut1, float* pafOut2, unsigned char* pabyValid,
                      double dfO1, double dfO2, double dfS1, double dfS2, double dfTol,
                      bool bFlag) const override {
        return nm::ImageToGround(this, nCols, nRows, nStep, pafA, pafB, pafZ, pafOut1, pafOut2,
                                 pabyValid, dfO1, dfO2, dfS1, dfS2, dfTol, bFlag);
    }
    int ImageToGround(double dfLine, double dfZ, int nCount, const double* padfIn, double* padfX,
                      double* padfY, int* panValid, bool bFlag) const override {
        return nm::ImageToGround(this, dfLine, dfZ, nCount, padfIn, padfX, padfY, panValid, bFlag);
    }
    int GroundToImage(int nCols, int nRows, int nStep, const float* pafA, const float* pafB,
                      const float* pafZ, float* pafOut1, float* pafOut2, unsigned char* pabyValid,
                      double dfO1, double dfO2, double dfS1, double dfS2, double dfTol,
                      bool bFlag) const override {
        return nm::GroundToImage(this, nCols, nRows, nStep, pafA, pafB, pafZ, pafOut1, pafOut2,
                                 pabyValid, dfO1, dfO2, dfS1, dfS2, dfTol, bFlag);
    }
    int GroundToImage(double dfY, double dfZ, int nCount, const double* padfIn, double* padfP,
                      double* padfL, int* panValid, bool bFlag) const override {
        return nm::GroundToImage(this, dfY, dfZ, nCount, padfIn, padfP, padfL, panValid, bFlag);
    }
};

// Heights in metres, row by row, of smooth hills around 300 m; columns past
// 400 stand dfCliff higher (0 for hills only).
inline std::vector<float> HillTerrain(int nCols, int nRows, double dfCliff) {
    std::vector<float> afZ(static_cast<std::size_t>(nCols) * nRows);
    for (int r = 0; r < nRows; ++r)
        for (int c = 0; c < nCols; ++c)
            afZ[static_cast<std::size_t>(r) * nCols + c] =
                static_cast<float>(300.0 + 200.0 * std::sin(c / 37.0) * std::cos(r / 53.0) +
                                   (c > 400 ? dfCliff : 0.0));
    return afZ;
}

}  // namespace support
}  // namespace lumo
