#include "rpc_fit.h"

#include <algorithm>
#include <cmath>
#include <memory>
#include <string>
#include <vector>

#include "cli_error.h"
#include "nova/crs.h"
#include "nova/dem.h"
#include "nova/rpc.h"
#include "points_io.h"

namespace lumo::cli {
namespace {

using nova::mathmodel::IMathModel;

// The fitted grid: image positions on kGridSteps + 1 columns and rows, on
// kHeightSteps + 1 heights; the check grid lies half a step off in all three.
constexpr int kGridSteps = 20;
constexpr int kHeightSteps = 6;
// Passes of the datum conversion: the undulation changes by centimetres
// over the distance the first pass moves a point.
constexpr int kDatumPasses = 3;

// One image position at a height above the ellipsoid, on the ground.
struct GridPoint {
    double dfPixel;
    double dfLine;
    double dfHeight;  // above the ellipsoid
    double dfLon;
    double dfLat;
};

// Grid of image positions and heights; dfOffset 0.5 gives the check grid.
std::vector<GridPoint> MapGrid(const EllipsoidalGround& oMapper, int nPixels, int nLines,
                               double dfMinHeight, double dfMaxHeight, double dfOffset) {
    const int nSteps = dfOffset > 0.0 ? kGridSteps : kGridSteps + 1;
    const int nLayers = dfOffset > 0.0 ? kHeightSteps : kHeightSteps + 1;
    std::vector<GridPoint> asPoints;
    for (int k = 0; k < nLayers; ++k) {
        for (int j = 0; j < nSteps; ++j) {
            for (int i = 0; i < nSteps; ++i) {
                GridPoint sPoint{
                    nPixels * (i + dfOffset) / kGridSteps, nLines * (j + dfOffset) / kGridSteps,
                    dfMinHeight + (dfMaxHeight - dfMinHeight) * (k + dfOffset) / kHeightSteps, 0.0,
                    0.0};
                if (oMapper.Map(sPoint.dfPixel, sPoint.dfLine, sPoint.dfHeight, sPoint.dfLon,
                                sPoint.dfLat)) {
                    asPoints.push_back(sPoint);
                }
            }
        }
    }
    return asPoints;
}

// The host's fit in the rational polynomials' own convention, centre of the
// first pixel at 0, as a record that shifts back by half a pixel.
RFPtr FitRecord(const std::vector<GridPoint>& asGrid) {
    std::vector<double> adfLat, adfLon, adfHeight, adfLine, adfPixel;
    for (const GridPoint& s : asGrid) {
        adfLat.push_back(s.dfLat);
        adfLon.push_back(s.dfLon);
        adfHeight.push_back(s.dfHeight);
        adfLine.push_back(s.dfLine - 0.5);
        adfPixel.push_back(s.dfPixel - 0.5);
    }
    nova::ogc::CRSPtr poWgs84(
        nova::ogc::ProjectionEngine::GetCSAuthorityFactory(nova::ogc::kProjectionEngineProj)
            ->CreateWGS84Ellipsoidal());
    nova::mathmodel::RpcCoefCalculator oCalculator;
    oCalculator.SetReportingFlag(false);
    nova::mathmodel::RpcMathModel* poFitted = nullptr;
    if (oCalculator.CalcCoef(adfLat, adfLon, adfHeight, adfLine, adfPixel, poWgs84.get(),
                             poFitted) != 0) {
        LUMO_CLI_FAIL("the rational polynomial fit failed: " + oCalculator.GetLastError());
    }
    const std::unique_ptr<nova::mathmodel::RpcMathModel> poOwner(poFitted);
    const nova::mathmodel::RpcCoefficients& c = poFitted->GetCoefficients();
    RFPtr psRF(RFAllocate(nullptr, RF_MAX_TERMS));
    psRF->nHalfPixelShift = 1;
    psRF->dfXOffset = c.dfLonOffset;
    psRF->dfXScale = c.dfLonScale;
    psRF->dfYOffset = c.dfLatOffset;
    psRF->dfYScale = c.dfLatScale;
    psRF->dfZOffset = c.dfHeightOffset;
    psRF->dfZScale = c.dfHeightScale;
    psRF->dfPixelOffset = c.dfPixelOffset;
    psRF->dfPixelScale = c.dfPixelScale;
    psRF->dfLineOffset = c.dfLineOffset;
    psRF->dfLineScale = c.dfLineScale;
    std::copy_n(c.adfPixelNum, RF_MAX_TERMS, psRF->padfPixelNum);
    std::copy_n(c.adfPixelDen, RF_MAX_TERMS, psRF->padfPixelDen);
    std::copy_n(c.adfLineNum, RF_MAX_TERMS, psRF->padfLineNum);
    std::copy_n(c.adfLineDen, RF_MAX_TERMS, psRF->padfLineDen);
    return psRF;
}

// How far the record puts the grid's ground points from their image
// positions.
RpcFitErrors Errors(RFInfo_t& sRF, const std::vector<GridPoint>& asGrid) {
    RpcFitErrors sErrors;
    double dfSumSquares = 0.0;
    for (const GridPoint& s : asGrid) {
        double dfPixel = 0.0, dfLine = 0.0;
        RFGeo2Img(&sRF, s.dfLon, s.dfLat, s.dfHeight, &dfPixel, &dfLine);
        const double dfError = std::hypot(dfPixel - s.dfPixel, dfLine - s.dfLine);
        sErrors.dfMax = std::max(sErrors.dfMax, std::isfinite(dfError) ? dfError : HUGE_VAL);
        dfSumSquares += dfError * dfError;
        ++sErrors.nPoints;
    }
    sErrors.dfRms = sErrors.nPoints > 0 ? std::sqrt(dfSumSquares / sErrors.nPoints) : 0.0;
    return sErrors;
}

}  // namespace

EllipsoidalGround::EllipsoidalGround(const IMathModel& oModel) : moModel(oModel) {
    const nova::ogc::cs::ICRS* poCRS = oModel.GetCRS();
    if (poCRS == nullptr) LUMO_CLI_FAIL("the model has no coordinate system");
    mpoGeoid.reset(nova::dem::DEMFactory::CreateGlobalDEM(true, 8));
    if (!mpoGeoid)
        LUMO_CLI_FAIL("the EGM96 geoid grid (Debian package proj-data) is not installed");
    mbOrthometric = poCRS->GetVerticalDatumType() == nova::ogc::cs::CS_VD_Orthometric;
    nova::ogc::CRSPtr poHorizontal(
        nova::ogc::utils::CreateCompoundCS(poCRS, nova::ogc::cs::CS_VD_Ellipsoidal));
    mpoToGeographic.reset(
        nova::ogc::utils::CreateCRSTransform(poHorizontal.get(), mpoGeoid->GetCRS(), 0.0));
    if (!mpoToGeographic) {
        LUMO_CLI_FAIL("the model's coordinate system " + poCRS->GetName() +
                      " cannot be related to longitude and latitude");
    }
}

bool EllipsoidalGround::Map(double dfPixel, double dfLine, double dfHeight, double& dfLon,
                            double& dfLat) const {
    double dfUndulation = 0.0;
    const int nPasses = mbOrthometric ? kDatumPasses : 1;
    for (int i = 0; i < nPasses; ++i) {
        double dfX = 0.0, dfY = 0.0, dfZ = 0.0;
        if (moModel.ImageToGround(dfPixel, dfLine, dfHeight - dfUndulation, dfX, dfY, false) != 0 ||
            !mpoToGeographic->TransformPoint(dfX, dfY, 0.0, dfLon, dfLat, dfZ)) {
            return false;
        }
        if (mbOrthometric && !mpoGeoid->GetHeight(dfLon, dfLat, dfUndulation)) return false;
    }
    return true;
}

RpcFit FitRpcToModel(const IMathModel& oModel, int nPixels, int nLines, double dfMinHeight,
                     double dfMaxHeight) {
    if (nPixels < 1 || nLines < 1) {
        LUMO_CLI_FAIL("the model's image size " + std::to_string(nPixels) + " x " +
                      std::to_string(nLines) + " is unknown; give --pixels and --lines");
    }
    if (!(dfMinHeight < dfMaxHeight) || !std::isfinite(dfMinHeight) ||
        !std::isfinite(dfMaxHeight)) {
        LUMO_CLI_FAIL("invalid height range " + FormatDouble(dfMinHeight) + " to " +
                      FormatDouble(dfMaxHeight));
    }
    const EllipsoidalGround oMapper(oModel);
    const std::vector<GridPoint> asFit =
        MapGrid(oMapper, nPixels, nLines, dfMinHeight, dfMaxHeight, 0.0);
    const std::vector<GridPoint> asCheck =
        MapGrid(oMapper, nPixels, nLines, dfMinHeight, dfMaxHeight, 0.5);
    const std::size_t nFitExpected =
        static_cast<std::size_t>(kGridSteps + 1) * (kGridSteps + 1) * (kHeightSteps + 1);
    if (asFit.size() < nFitExpected) {
        LUMO_CLI_FAIL("the model maps only " + std::to_string(asFit.size()) + " of " +
                      std::to_string(nFitExpected) +
                      " grid points of its image and height range to the ground");
    }
    RpcFit sFit;
    sFit.psRF = FitRecord(asFit);
    sFit.sFit = Errors(*sFit.psRF, asFit);
    sFit.sCheck = Errors(*sFit.psRF, asCheck);
    return sFit;
}

}  // namespace lumo::cli
