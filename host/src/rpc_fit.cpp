// Terrain-independent fit of a rational polynomial model to sampled ground
// and image points: normalisation, then for each image coordinate a
// linearised, iteratively reweighted least-squares fit of numerator and
// denominator with a small Tikhonov regularisation.
#include <Eigen/Dense>
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <memory>
#include <vector>

#include "nova/rpc.h"
#include "nova/runtime.h"

namespace nova {
namespace mathmodel {
namespace {

constexpr int kUnknowns = 2 * kRpcTerms - 1;  // numerator, denominator without its 1
constexpr int kMaxPasses = 10;
// Relative change of the residual below which reweighting stops.
constexpr double kPassTolerance = 1e-4;
// Ridges added, one after the other until a fit succeeds, to the
// equilibrated normal matrix (whose diagonal is 1). A ridge only moves
// directions the points leave undetermined (height terms of a plane of
// points, a denominator that mimics the numerator) and keeps the
// denominators close to 1 there. On simulated radar scenes 1e-10 costs
// nothing measurable but now and then lets a denominator wander towards
// zero; the larger ones then tame it at a cost of hundredths of a pixel.
constexpr double kRidges[] = {1e-10, 1e-8, 1e-6, 1e-4};
// Denominators must stay clear of zero over the fitted points.
constexpr double kSmallestFittedDenominator = 0.1;

// Offset and scale that map the values onto [-1, 1]; a constant value gets
// scale 1.
void Normalisation(const std::vector<double>& adf, double& dfOffset, double& dfScale) {
    const auto [itMin, itMax] = std::minmax_element(adf.begin(), adf.end());
    dfOffset = 0.5 * (*itMin + *itMax);
    dfScale = 0.5 * (*itMax - *itMin);
    if (!(dfScale > 0.0)) dfScale = 1.0;
}

struct RatioFit {
    double adfNum[kRpcTerms] = {};
    double adfDen[kRpcTerms] = {};
    int nPasses = 0;
    double dfMinDen = 0.0;
};

// Fits r = num / den over the points whose terms are the rows of t.
bool FitRatio(const Eigen::MatrixXd& t, const Eigen::VectorXd& r, double dfRidge, RatioFit& fit) {
    const Eigen::Index n = t.rows();
    Eigen::VectorXd den = Eigen::VectorXd::Ones(n);
    Eigen::MatrixXd a(n, kUnknowns);
    Eigen::VectorXd x = Eigen::VectorXd::Zero(kUnknowns);
    double dfPrevRms = -1.0;
    for (int nPass = 1; nPass <= kMaxPasses; ++nPass) {
        // num - r (den - 1) = r, each row divided by the previous
        // denominator so that the pass minimises the residual of the ratio.
        const Eigen::VectorXd w = den.cwiseInverse();
        a.leftCols(kRpcTerms) = w.asDiagonal() * t;
        a.rightCols(kRpcTerms - 1) = (-w.cwiseProduct(r)).asDiagonal() * t.rightCols(kRpcTerms - 1);
        const Eigen::VectorXd b = w.cwiseProduct(r);
        Eigen::MatrixXd m = Eigen::MatrixXd::Zero(kUnknowns, kUnknowns);
        m.selfadjointView<Eigen::Lower>().rankUpdate(a.transpose());
        m = m.selfadjointView<Eigen::Lower>();
        const Eigen::VectorXd g = a.transpose() * b;
        // Equilibrate so that the ridge is relative to each column's size.
        Eigen::VectorXd s = m.diagonal().cwiseSqrt();
        for (Eigen::Index k = 0; k < s.size(); ++k) {
            if (!(s[k] > 0.0)) s[k] = 1.0;
        }
        const Eigen::VectorXd sInv = s.cwiseInverse();
        Eigen::MatrixXd me = sInv.asDiagonal() * m * sInv.asDiagonal();
        me.diagonal().array() += dfRidge;
        const Eigen::VectorXd y = me.ldlt().solve(sInv.cwiseProduct(g));
        x = sInv.cwiseProduct(y);
        if (!x.allFinite()) return false;

        den = Eigen::VectorXd::Ones(n) + t.rightCols(kRpcTerms - 1) * x.tail(kRpcTerms - 1);
        fit.dfMinDen = den.minCoeff();
        if (!(fit.dfMinDen > kSmallestFittedDenominator)) return false;
        const Eigen::VectorXd resid = (t * x.head(kRpcTerms)).cwiseQuotient(den) - r;
        const double dfRms = std::sqrt(resid.squaredNorm() / static_cast<double>(n));
        fit.nPasses = nPass;
        if (dfPrevRms >= 0.0 && std::fabs(dfPrevRms - dfRms) <= kPassTolerance * dfRms) break;
        dfPrevRms = dfRms;
    }
    for (int k = 0; k < kRpcTerms; ++k) fit.adfNum[k] = x[k];
    fit.adfDen[0] = 1.0;
    for (int k = 1; k < kRpcTerms; ++k) fit.adfDen[k] = x[kRpcTerms + k - 1];
    return true;
}

bool AllFinite(const std::vector<double>& adf) {
    return std::all_of(adf.begin(), adf.end(), [](double v) { return std::isfinite(v); });
}

}  // namespace

int RpcCoefCalculator::CalcCoef(const std::vector<double>& adfLat,
                                const std::vector<double>& adfLon,
                                const std::vector<double>& adfHeight,
                                const std::vector<double>& adfLine,
                                const std::vector<double>& adfPixel, const ogc::cs::ICRS* poCRS,
                                RpcMathModel*& poModel) {
    poModel = nullptr;
    mosError.clear();
    const std::size_t n = adfLat.size();
    if (adfLon.size() != n || adfHeight.size() != n || adfLine.size() != n ||
        adfPixel.size() != n) {
        mosError = "the five point vectors differ in length";
        return -1;
    }
    if (n < static_cast<std::size_t>(kUnknowns)) {
        mosError = FormatString("%zu points cannot determine %d coefficients", n, kUnknowns);
        return -1;
    }
    if (!AllFinite(adfLat) || !AllFinite(adfLon) || !AllFinite(adfHeight) || !AllFinite(adfLine) ||
        !AllFinite(adfPixel)) {
        mosError = "a point has a coordinate that is not finite";
        return -1;
    }

    // Longitudes continuous around the first one, so that a scene across
    // the 180th meridian normalises over its own extent.
    std::vector<double> adfLonCont(n);
    for (std::size_t i = 0; i < n; ++i) {
        adfLonCont[i] = adfLon[0] + std::remainder(adfLon[i] - adfLon[0], 360.0);
    }
    RpcCoefficients c;
    Normalisation(adfLat, c.dfLatOffset, c.dfLatScale);
    Normalisation(adfLonCont, c.dfLonOffset, c.dfLonScale);
    Normalisation(adfHeight, c.dfHeightOffset, c.dfHeightScale);
    Normalisation(adfLine, c.dfLineOffset, c.dfLineScale);
    Normalisation(adfPixel, c.dfPixelOffset, c.dfPixelScale);

    const auto rows = static_cast<Eigen::Index>(n);
    Eigen::MatrixXd t(rows, kRpcTerms);
    Eigen::VectorXd rPixel(rows), rLine(rows);
    for (Eigen::Index i = 0; i < rows; ++i) {
        const auto k = static_cast<std::size_t>(i);
        double terms[kRpcTerms];
        RpcTerms((adfLonCont[k] - c.dfLonOffset) / c.dfLonScale,
                 (adfLat[k] - c.dfLatOffset) / c.dfLatScale,
                 (adfHeight[k] - c.dfHeightOffset) / c.dfHeightScale, terms);
        for (int j = 0; j < kRpcTerms; ++j) t(i, j) = terms[j];
        rPixel[i] = (adfPixel[k] - c.dfPixelOffset) / c.dfPixelScale;
        rLine[i] = (adfLine[k] - c.dfLineOffset) / c.dfLineScale;
    }
    RatioFit sPixel, sLine;
    const auto fitWithRidges = [&](const Eigen::VectorXd& r, RatioFit& fit) {
        for (double dfRidge : kRidges) {
            if (FitRatio(t, r, dfRidge, fit)) return true;
        }
        return false;
    };
    if (!fitWithRidges(rPixel, sPixel) || !fitWithRidges(rLine, sLine)) {
        mosError = "the fitted denominators come close to zero over the points";
        return -1;
    }
    std::copy(sPixel.adfNum, sPixel.adfNum + kRpcTerms, c.adfPixelNum);
    std::copy(sPixel.adfDen, sPixel.adfDen + kRpcTerms, c.adfPixelDen);
    std::copy(sLine.adfNum, sLine.adfNum + kRpcTerms, c.adfLineNum);
    std::copy(sLine.adfDen, sLine.adfDen + kRpcTerms, c.adfLineDen);

    std::unique_ptr<RpcMathModel> poFit(new RpcMathModel(c, poCRS));
    RpcFitReport sReport;
    sReport.nPoints = static_cast<int>(n);
    sReport.nIterations = std::max(sPixel.nPasses, sLine.nPasses);
    double dfSumPixel = 0.0, dfSumLine = 0.0;
    for (std::size_t i = 0; i < n; ++i) {
        double dfPixel = 0.0, dfLine = 0.0;
        if (poFit->GroundToImage(adfLon[i], adfLat[i], adfHeight[i], dfPixel, dfLine, false) != 0) {
            mosError = "the fitted model cannot be evaluated at every point";
            return -1;
        }
        const double ePixel = std::fabs(dfPixel - adfPixel[i]);
        const double eLine = std::fabs(dfLine - adfLine[i]);
        dfSumPixel += ePixel * ePixel;
        dfSumLine += eLine * eLine;
        sReport.dfMaxPixel = std::max(sReport.dfMaxPixel, ePixel);
        sReport.dfMaxLine = std::max(sReport.dfMaxLine, eLine);
    }
    sReport.dfRmsPixel = std::sqrt(dfSumPixel / static_cast<double>(n));
    sReport.dfRmsLine = std::sqrt(dfSumLine / static_cast<double>(n));
    poFit->SetFitReport(sReport);
    if (mbReport) {
        std::fprintf(stderr,
                     "RPC fit: %d points, %d passes; rms pixel %.3g line %.3g, max pixel %.3g "
                     "line %.3g\n",
                     sReport.nPoints, sReport.nIterations, sReport.dfRmsPixel, sReport.dfRmsLine,
                     sReport.dfMaxPixel, sReport.dfMaxLine);
    }
    poModel = poFit.release();
    return 0;
}

}  // namespace mathmodel
}  // namespace nova
