// Rational polynomial (RPC) math models: image pixel and line as ratios of
// cubic polynomials in normalised longitude, latitude and height, and the
// terrain-independent fit of such a model to a grid of ground and image
// points sampled from any other model.
//
// Term k of every polynomial, with L, P, H the normalised longitude,
// latitude and height:
//   0 1    4 LP   8 P²   12 LP²   16 PH²
//   1 L    5 LH   9 H²   13 LH²   17 L²H
//   2 P    6 PH  10 PLH  14 L²P   18 P²H
//   3 H    7 L²  11 L³   15 P³    19 H³
// Denominators have a constant term of 1, so a model has 78 free
// coefficients. Pixel 0 and line 0 are the positions of the first pixel and
// line as the fitted points give them (no half-pixel shift is applied).
#pragma once

#include <string>
#include <vector>

#include "nova/mathmodel_core.h"
#include "nova/rpc_terms.h"

namespace nova {
namespace ogc {
namespace cs {
class ICRS;
}  // namespace cs
}  // namespace ogc

namespace mathmodel {

constexpr int kRpcTerms = kRpcTermCount;

// Coefficients and normalisation of a rational polynomial model. Normalised
// value = (value - offset) / scale; longitudes are taken continuous around
// dfLonOffset, so a model that straddles the 180th meridian works with
// longitudes written either way.
struct RpcCoefficients {
    double dfLineOffset = 0.0;
    double dfLineScale = 1.0;
    double dfPixelOffset = 0.0;
    double dfPixelScale = 1.0;
    double dfLatOffset = 0.0;
    double dfLatScale = 1.0;
    double dfLonOffset = 0.0;
    double dfLonScale = 1.0;
    double dfHeightOffset = 0.0;
    double dfHeightScale = 1.0;
    double adfLineNum[kRpcTerms] = {};
    double adfLineDen[kRpcTerms] = {};  // [0] is 1
    double adfPixelNum[kRpcTerms] = {};
    double adfPixelDen[kRpcTerms] = {};  // [0] is 1
};

// Residuals of a fit in pixels, over all fitted points.
struct RpcFitReport {
    int nPoints = 0;      // points fitted
    int nIterations = 0;  // reweighting passes made
    double dfRmsPixel = 0.0;
    double dfRmsLine = 0.0;
    double dfMaxPixel = 0.0;
    double dfMaxLine = 0.0;
};

// A rational polynomial model behind the host's math-model interface.
// Ground coordinates are longitude and latitude in degrees (X, Y) and height
// in metres in the model's CRS. The model answers only inside the ground
// box it was fitted over, widened by a tenth of its size on every side
// (normalised coordinates within +-1.1): outside it a cubic ratio is an
// extrapolation that cannot be trusted, and both directions fail there.
class RpcMathModel : public PointMathModel {
  public:
    using PointMathModel::GroundToImage;
    using PointMathModel::ImageToGround;

    // Throws nova::ParameterException naming the field when an offset or
    // scale is not finite, a scale is zero, a coefficient is not finite or a
    // denominator's constant term is not 1. poCRS is cloned (may be null).
    RpcMathModel(const RpcCoefficients& sCoefs, const ogc::cs::ICRS* poCRS);
    RpcMathModel(const RpcMathModel& oOther);
    RpcMathModel& operator=(const RpcMathModel&) = delete;
    ~RpcMathModel() override;

    const ogc::cs::ICRS* GetCRS() const override;
    MathModelType GetModelType() const override;  // MM_TYPE_RPC
    std::string GetModelName() const override;    // "RPC"
    int GetNumColumns() const override;
    int GetNumRows() const override;
    int GetDownsampleFactor() const override;
    // The height range of the fit's domain.
    int GetMinValidHeight(double& dfHeight) const override;
    int GetMaxValidHeight(double& dfHeight) const override;
    bool IsHeightDependent() const override;
    // True for this object and for any RPC model with the same coefficients
    // and raster size.
    bool IsEqual(const IMathModel* poOther) const override;

    // Newton's method on the forward functions from a linear first guess,
    // stopping when a step moves less than 1e-12 (normalised) or after 30
    // steps; the answer is accepted only when projecting it forward lands
    // within 1e-6 pixels of (dfPixel, dfLine). Failure: -1 and -1e20 in both
    // outputs.
    int ImageToGround(double dfPixel, double dfLine, double dfZ, double& dfX, double& dfY,
                      bool bFlag) const override;

    // Failure (-1, outputs -1e20): a non-finite input, a point outside the
    // model's domain, or a denominator that vanishes there.
    int GroundToImage(double dfX, double dfY, double dfZ, double& dfPixel, double& dfLine,
                      bool bFlag) const override;

    IMathModel* Clone() const override;
    void SetDownsampleFactor(int nFactor) override;

    // Size of the image the model describes (reported by GetNumColumns and
    // GetNumRows); negative values are taken as 0.
    void SetRasterDimensions(int nPixels, int nLines);
    const RpcCoefficients& GetCoefficients() const { return msCoefs; }
    // The fit's residuals when the model came from RpcCoefCalculator.
    const RpcFitReport& GetFitReport() const { return msReport; }
    void SetFitReport(const RpcFitReport& sReport) { msReport = sReport; }

  private:
    // First guess of the inverse: normalised (L, P) as an affine function of
    // normalised (pixel, line, height), fitted to the model itself.
    void FitInverseGuess();

    RpcCoefficients msCoefs;
    ogc::cs::ICRS* mpoCRS = nullptr;
    int mnPixels = 0;
    int mnLines = 0;
    int mnDownsampleFactor = 1;
    double madfGuessL[4] = {};  // L = g0 + g1 x + g2 y + g3 h (normalised)
    double madfGuessP[4] = {};
    RpcFitReport msReport;
};

// Fits rational polynomial models to sampled points.
class RpcCoefCalculator {
  public:
    RpcCoefCalculator() = default;

    // When on, CalcCoef prints the fit's residuals on standard error.
    void SetReportingFlag(bool bReport) { mbReport = bReport; }

    // Fits a model to the points (one entry per point in each vector;
    // latitudes and longitudes in degrees, heights in metres, image
    // positions in pixels). The points should cover the image on several
    // heights; a plane of points gives a model without height terms.
    // The fit is linearised and iteratively reweighted least squares with a
    // small Tikhonov regularisation on equilibrated columns, which keeps
    // the denominators tame when the points do not determine every term.
    // Returns 0 and a new model in poModel (owned by the caller; poCRS is
    // cloned into it), or -1 with poModel null and GetLastError() telling
    // why: vectors of unequal length, fewer than 39 points, a value that is
    // not finite, or a fit whose denominator vanishes over the points.
    int CalcCoef(const std::vector<double>& adfLat, const std::vector<double>& adfLon,
                 const std::vector<double>& adfHeight, const std::vector<double>& adfLine,
                 const std::vector<double>& adfPixel, const ogc::cs::ICRS* poCRS,
                 RpcMathModel*& poModel);

    const std::string& GetLastError() const { return mosError; }

  private:
    bool mbReport = true;
    std::string mosError;
};

// Term values of (L, P, H) in the order above.
void RpcTerms(double L, double P, double H, double* padfTerms);

}  // namespace mathmodel
}  // namespace nova
