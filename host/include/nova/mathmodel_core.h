// Math-model core of the host: the abstract interface every math model (image
// pixel/line <-> ground X/Y/Z) implements, and the generic evaluation of rows
// and blocks of points through a model's point operations.
#pragma once

#include <string>

namespace nova {
namespace ogc {
namespace cs {
class ICRS;
}  // namespace cs
}  // namespace ogc

namespace mathmodel {

// Family of a math model as the host knows it. Values are stored by callers,
// so they never change.
enum MathModelType {
    MM_TYPE_UNKNOWN = 0,
    MM_TYPE_RPC = 1,         // rational polynomial coefficients
    MM_TYPE_POLYNOMIAL = 2,  // polynomial fitted to control points
    MM_TYPE_THINPLATE = 3,   // thin plate spline
    MM_TYPE_AFFINE = 4,      // affine georeferencing of a raster
    MM_TYPE_GRID = 5,        // lookup grid of ground positions
    MM_TYPE_LUMO = 6,        // any model of the lumo library
    MM_TYPE_USER = 100       // first value free for application models
};

// Abstract math model. Point operations return 0 on success and -1 on
// failure; the array and block operations take the arguments of the free
// functions ImageToGround/GroundToImage below and normally forward to them.
// Ground coordinates are in the model's CRS (GetCRS), heights in metres.
class IMathModel {
  public:
    virtual ~IMathModel();

    // The CRS of the ground coordinates, still owned by the model.
    virtual const nova::ogc::cs::ICRS* GetCRS() const = 0;
    virtual MathModelType GetModelType() const = 0;
    virtual std::string GetModelName() const = 0;
    virtual int GetNumColumns() const = 0;
    virtual int GetNumRows() const = 0;
    virtual int GetDownsampleFactor() const = 0;
    // 0 and the height in dfHeight when the model knows a valid range; -1
    // with dfHeight unchanged otherwise.
    virtual int GetMinValidHeight(double& dfHeight) const = 0;
    virtual int GetMaxValidHeight(double& dfHeight) const = 0;
    virtual bool IsHeightDependent() const = 0;
    virtual bool IsEqual(const IMathModel* poOther) const = 0;

    // Block image -> ground: pixel/line in, X/Y out.
    virtual int ImageToGround(int nCols, int nRows, int nGridStep, const float* pafPixel,
                              const float* pafLine, const float* pafZ, float* pafX, float* pafY,
                              unsigned char* pabyValid, double dfOriginPixel, double dfOriginLine,
                              double dfStepPixel, double dfStepLine, double dfTolerance,
                              bool bFlag) const = 0;
    // Array image -> ground along one image line.
    virtual int ImageToGround(double dfLine, double dfZ, int nCount, const double* padfPixel,
                              double* padfX, double* padfY, int* panValid, bool bFlag) const = 0;
    // Point image -> ground at height dfZ.
    virtual int ImageToGround(double dfPixel, double dfLine, double dfZ, double& dfX, double& dfY,
                              bool bFlag) const = 0;

    // Block ground -> image: X/Y in, pixel/line out.
    virtual int GroundToImage(int nCols, int nRows, int nGridStep, const float* pafX,
                              const float* pafY, const float* pafZ, float* pafPixel, float* pafLine,
                              unsigned char* pabyValid, double dfOriginX, double dfOriginY,
                              double dfStepX, double dfStepY, double dfTolerance,
                              bool bFlag) const = 0;
    // Array ground -> image along one ground row of constant Y.
    virtual int GroundToImage(double dfY, double dfZ, int nCount, const double* padfX,
                              double* padfPixel, double* padfLine, int* panValid,
                              bool bFlag) const = 0;
    // Point ground -> image.
    virtual int GroundToImage(double dfX, double dfY, double dfZ, double& dfPixel, double& dfLine,
                              bool bFlag) const = 0;

    // A new deep copy; the caller owns it.
    virtual IMathModel* Clone() const = 0;
    virtual void SetDownsampleFactor(int nFactor) = 0;

  protected:
    IMathModel() = default;
    IMathModel(const IMathModel&) = default;
    IMathModel& operator=(const IMathModel&) = default;
};

// Value written to the outputs of a point that could not be evaluated.
constexpr double kMathModelNullValue = -1e20;

// Both forms below split large arrays and blocks across worker threads
// (nova/parallel.h: at most GetEvaluationThreads(), none for small ones), so
// the model's const point operations must be safe to call concurrently. The
// results do not depend on the number of threads.

// Array form: evaluates nCount points of one row through the model's point
// operation.
//   dfFixed   the coordinate shared by the row: the line for ImageToGround,
//             the ground Y for GroundToImage;
//   dfZ       the height of every point;
//   padfIn    nCount coordinates along the row (pixels, resp. ground X);
//   padfOut1/padfOut2  X and Y, resp. pixel and line;
//   panValid  per point 1 when evaluated, 0 when it failed (may be null);
//   bFlag     passed unchanged to each point operation.
// A failed point, a point with a non-finite or null (-1e20) input or height,
// and a point whose result is not finite get -1e20 in both outputs.
// Returns 0 when every point succeeded, -1 when any failed or the arguments
// are bad (null model or array, negative count; a warning is then reported
// and nothing is written).
int ImageToGround(const IMathModel* poModel, double dfFixed, double dfZ, int nCount,
                  const double* padfIn, double* padfOut1, double* padfOut2, int* panValid,
                  bool bFlag);
int GroundToImage(const IMathModel* poModel, double dfFixed, double dfZ, int nCount,
                  const double* padfIn, double* padfOut1, double* padfOut2, int* panValid,
                  bool bFlag);

// Block form: evaluates nCols x nRows points stored row by row (index
// row * nCols + col).
//   pafIn1/pafIn2  input coordinates of every point (pixel/line, resp. X/Y),
//                  or both null for a regular grid where point (col, row) is
//                  (dfOrigin1 + col * dfStep1, dfOrigin2 + row * dfStep2);
//   pafZ           height of every point, or null for height 0;
//   pafOut1/pafOut2  outputs (X/Y, resp. pixel/line);
//   pabyValid      per point 1 when evaluated, 0 when it failed (may be null);
//   nGridStep      spacing in points of the coarse grid evaluated exactly;
//   dfTolerance    largest accepted interpolation error in output units; a
//                  value <= 0 (or nGridStep 1) evaluates every point exactly;
//   bFlag          passed unchanged to each point operation.
// The model is evaluated exactly at the coarse grid nodes and inside each
// grid cell at its centre and edge midpoints. A cell whose checks agree with
// the interpolation within dfTolerance is filled by bilinear interpolation
// (with a first-order correction for heights, and for explicit input arrays,
// off the cell's bilinear surface); otherwise it is split in four and each
// part treated alike, down to exact evaluation. Outputs are floats, so their
// precision is that of float whatever the tolerance. Failed points get -1e20
// as for the array form; an interpolated cell has succeeded at all its
// checked points, so a failure region smaller than the checks can be missed.
// Returns 0 when every point succeeded, -1 when any failed or the arguments
// are bad (null model or output, negative sizes, a grid step below 1, only
// one input array, an output that is also an input, a NaN tolerance, a
// non-finite origin or step; a warning is then reported and nothing written).
int ImageToGround(const IMathModel* poModel, int nCols, int nRows, int nGridStep,
                  const float* pafIn1, const float* pafIn2, const float* pafZ, float* pafOut1,
                  float* pafOut2, unsigned char* pabyValid, double dfOrigin1, double dfOrigin2,
                  double dfStep1, double dfStep2, double dfTolerance, bool bFlag);
int GroundToImage(const IMathModel* poModel, int nCols, int nRows, int nGridStep,
                  const float* pafIn1, const float* pafIn2, const float* pafZ, float* pafOut1,
                  float* pafOut2, unsigned char* pabyValid, double dfOrigin1, double dfOrigin2,
                  double dfStep1, double dfStep2, double dfTolerance, bool bFlag);

// A math model defined by its point operations: its array and block
// operations are the host's evaluators above, called with the model itself.
// Models that wrap records or other models derive from it and implement the
// rest of the interface.
class PointMathModel : public IMathModel {
  public:
    using IMathModel::GroundToImage;
    using IMathModel::ImageToGround;

    int ImageToGround(int nCols, int nRows, int nGridStep, const float* pafPixel,
                      const float* pafLine, const float* pafZ, float* pafX, float* pafY,
                      unsigned char* pabyValid, double dfOriginPixel, double dfOriginLine,
                      double dfStepPixel, double dfStepLine, double dfTolerance,
                      bool bFlag) const override;
    int ImageToGround(double dfLine, double dfZ, int nCount, const double* padfPixel, double* padfX,
                      double* padfY, int* panValid, bool bFlag) const override;
    int GroundToImage(int nCols, int nRows, int nGridStep, const float* pafX, const float* pafY,
                      const float* pafZ, float* pafPixel, float* pafLine, unsigned char* pabyValid,
                      double dfOriginX, double dfOriginY, double dfStepX, double dfStepY,
                      double dfTolerance, bool bFlag) const override;
    int GroundToImage(double dfY, double dfZ, int nCount, const double* padfX, double* padfPixel,
                      double* padfLine, int* panValid, bool bFlag) const override;

  protected:
    PointMathModel() = default;
    PointMathModel(const PointMathModel&) = default;
    PointMathModel& operator=(const PointMathModel&) = default;
};

}  // namespace mathmodel
}  // namespace nova
