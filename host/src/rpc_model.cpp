// Rational polynomial math model: evaluation, the Newton inverse with its
// forward check, and the interface operations.
#include <Eigen/Dense>
#include <algorithm>
#include <cmath>
#include <string>

#include "nova/crs.h"
#include "nova/rpc.h"
#include "nova/rpc_terms.h"
#include "nova/runtime.h"

namespace nova {
namespace mathmodel {
namespace {

constexpr const char* kFile = "host/src/rpc_model.cpp";
constexpr const char* kFnConstructor =
    "nova::mathmodel::RpcMathModel::RpcMathModel(const RpcCoefficients&, const ICRS*)";

// Normalised coordinates beyond this are outside the model's domain.
constexpr double kDomainLimit = 1.1;
// A denominator smaller than this is a pole of the model.
constexpr double kSmallestDenominator = 1e-8;
constexpr int kMaxNewtonSteps = 30;
constexpr double kNewtonStepTolerance = 1e-12;
constexpr double kInverseTolerancePixels = 1e-6;

double Dot20(const double* a, const double* b) {
    double s = 0.0;
    for (int k = 0; k < kRpcTerms; ++k) s += a[k] * b[k];
    return s;
}

bool IsUsable(double dfValue) {
    return std::isfinite(dfValue) && dfValue != kMathModelNullValue;
}

void CheckField(bool bValid, const char* pszName, const char* pszWhat) {
    if (!bValid) {
        throw ParameterException(pszName, 1, "", "",
                                 FormatString("RPC coefficient field %s %s", pszName, pszWhat),
                                 kFile, kFnConstructor, __LINE__);
    }
}

void CheckScale(double dfOffset, double dfScale, const char* pszOffset, const char* pszScale) {
    CheckField(std::isfinite(dfOffset), pszOffset, "is not finite");
    CheckField(std::isfinite(dfScale) && dfScale != 0.0, pszScale, "is zero or not finite");
}

void CheckCoefficients(const double* padf, const char* pszName) {
    for (int k = 0; k < kRpcTerms; ++k)
        CheckField(std::isfinite(padf[k]), pszName, "is not finite");
}

}  // namespace

void RpcTerms(double L, double P, double H, double* t) {
    RpcTermValues(L, P, H, t);
}

RpcMathModel::RpcMathModel(const RpcCoefficients& sCoefs, const ogc::cs::ICRS* poCRS)
    : msCoefs(sCoefs) {
    CheckScale(sCoefs.dfLineOffset, sCoefs.dfLineScale, "dfLineOffset", "dfLineScale");
    CheckScale(sCoefs.dfPixelOffset, sCoefs.dfPixelScale, "dfPixelOffset", "dfPixelScale");
    CheckScale(sCoefs.dfLatOffset, sCoefs.dfLatScale, "dfLatOffset", "dfLatScale");
    CheckScale(sCoefs.dfLonOffset, sCoefs.dfLonScale, "dfLonOffset", "dfLonScale");
    CheckScale(sCoefs.dfHeightOffset, sCoefs.dfHeightScale, "dfHeightOffset", "dfHeightScale");
    CheckCoefficients(sCoefs.adfLineNum, "adfLineNum");
    CheckCoefficients(sCoefs.adfLineDen, "adfLineDen");
    CheckCoefficients(sCoefs.adfPixelNum, "adfPixelNum");
    CheckCoefficients(sCoefs.adfPixelDen, "adfPixelDen");
    CheckField(sCoefs.adfLineDen[0] == 1.0, "adfLineDen", "has a constant term other than 1");
    CheckField(sCoefs.adfPixelDen[0] == 1.0, "adfPixelDen", "has a constant term other than 1");
    FitInverseGuess();
    if (poCRS != nullptr) mpoCRS = poCRS->Clone();
}

RpcMathModel::RpcMathModel(const RpcMathModel& oOther)
    : PointMathModel(oOther),
      msCoefs(oOther.msCoefs),
      mnPixels(oOther.mnPixels),
      mnLines(oOther.mnLines),
      mnDownsampleFactor(oOther.mnDownsampleFactor),
      msReport(oOther.msReport) {
    std::copy(oOther.madfGuessL, oOther.madfGuessL + 4, madfGuessL);
    std::copy(oOther.madfGuessP, oOther.madfGuessP + 4, madfGuessP);
    if (oOther.mpoCRS != nullptr) mpoCRS = oOther.mpoCRS->Clone();
}

RpcMathModel::~RpcMathModel() {
    if (mpoCRS != nullptr) mpoCRS->Release();
}

namespace {

// Normalised image position of normalised ground coordinates; false at a
// pole of either ratio.
bool EvaluateNormalised(const RpcCoefficients& c, double L, double P, double H, double& x,
                        double& y) {
    double t[kRpcTerms];
    RpcTerms(L, P, H, t);
    const double dfPixelDen = Dot20(c.adfPixelDen, t);
    const double dfLineDen = Dot20(c.adfLineDen, t);
    if (!(std::fabs(dfPixelDen) >= kSmallestDenominator) ||
        !(std::fabs(dfLineDen) >= kSmallestDenominator)) {
        return false;
    }
    x = Dot20(c.adfPixelNum, t) / dfPixelDen;
    y = Dot20(c.adfLineNum, t) / dfLineDen;
    return std::isfinite(x) && std::isfinite(y);
}

// Derivatives of the normalised pixel and line by L and P.
bool Jacobian(const RpcCoefficients& c, double L, double P, double H, double j[2][2]) {
    double t[kRpcTerms], dL[kRpcTerms], dP[kRpcTerms];
    RpcTerms(L, P, H, t);
    RpcTermDerivatives(L, P, H, dL, dP);
    const double* nums[2] = {c.adfPixelNum, c.adfLineNum};
    const double* dens[2] = {c.adfPixelDen, c.adfLineDen};
    for (int r = 0; r < 2; ++r) {
        const double n = Dot20(nums[r], t);
        const double d = Dot20(dens[r], t);
        if (!(std::fabs(d) >= kSmallestDenominator)) return false;
        j[r][0] = (Dot20(nums[r], dL) * d - n * Dot20(dens[r], dL)) / (d * d);
        j[r][1] = (Dot20(nums[r], dP) * d - n * Dot20(dens[r], dP)) / (d * d);
    }
    return true;
}

}  // namespace

void RpcMathModel::FitInverseGuess() {
    // The forward model sampled over its domain, inverted to first order.
    Eigen::MatrixXd a(75, 4);
    Eigen::VectorXd bL(75), bP(75);
    int n = 0;
    for (int i = 0; i < 5; ++i) {
        for (int k = 0; k < 5; ++k) {
            for (int h = 0; h < 3; ++h) {
                const double L = -1.0 + 0.5 * i;
                const double P = -1.0 + 0.5 * k;
                const double H = -1.0 + 1.0 * h;
                double x = 0.0, y = 0.0;
                if (!EvaluateNormalised(msCoefs, L, P, H, x, y)) continue;
                a.row(n) << 1.0, x, y, H;
                bL[n] = L;
                bP[n] = P;
                ++n;
            }
        }
    }
    if (n < 4) return;  // no usable guess: Newton starts at the centre
    const auto qr = a.topRows(n).colPivHouseholderQr();
    const Eigen::Vector4d gL = qr.solve(bL.head(n));
    const Eigen::Vector4d gP = qr.solve(bP.head(n));
    if (!gL.allFinite() || !gP.allFinite()) return;
    for (int k = 0; k < 4; ++k) {
        madfGuessL[k] = gL[k];
        madfGuessP[k] = gP[k];
    }
}

int RpcMathModel::GroundToImage(double dfX, double dfY, double dfZ, double& dfPixel, double& dfLine,
                                bool /*bFlag*/) const {
    dfPixel = dfLine = kMathModelNullValue;
    if (!IsUsable(dfX) || !IsUsable(dfY) || !IsUsable(dfZ)) return -1;
    const RpcCoefficients& c = msCoefs;
    const double L = std::remainder(dfX - c.dfLonOffset, 360.0) / c.dfLonScale;
    const double P = (dfY - c.dfLatOffset) / c.dfLatScale;
    const double H = (dfZ - c.dfHeightOffset) / c.dfHeightScale;
    if (!(std::fabs(L) <= kDomainLimit && std::fabs(P) <= kDomainLimit &&
          std::fabs(H) <= kDomainLimit)) {
        return -1;
    }
    double x = 0.0, y = 0.0;
    if (!EvaluateNormalised(c, L, P, H, x, y)) return -1;
    dfPixel = x * c.dfPixelScale + c.dfPixelOffset;
    dfLine = y * c.dfLineScale + c.dfLineOffset;
    return 0;
}

int RpcMathModel::ImageToGround(double dfPixel, double dfLine, double dfZ, double& dfX, double& dfY,
                                bool bFlag) const {
    dfX = dfY = kMathModelNullValue;
    if (!IsUsable(dfPixel) || !IsUsable(dfLine) || !IsUsable(dfZ)) return -1;
    const RpcCoefficients& c = msCoefs;
    const double xs = (dfPixel - c.dfPixelOffset) / c.dfPixelScale;
    const double ys = (dfLine - c.dfLineOffset) / c.dfLineScale;
    const double H = (dfZ - c.dfHeightOffset) / c.dfHeightScale;
    double L = madfGuessL[0] + madfGuessL[1] * xs + madfGuessL[2] * ys + madfGuessL[3] * H;
    double P = madfGuessP[0] + madfGuessP[1] * xs + madfGuessP[2] * ys + madfGuessP[3] * H;
    for (int nStep = 0; nStep < kMaxNewtonSteps; ++nStep) {
        double x = 0.0, y = 0.0, j[2][2];
        if (!EvaluateNormalised(c, L, P, H, x, y) || !Jacobian(c, L, P, H, j)) return -1;
        const double det = j[0][0] * j[1][1] - j[0][1] * j[1][0];
        if (!(std::fabs(det) > 0.0) || !std::isfinite(det)) return -1;
        const double rx = xs - x;
        const double ry = ys - y;
        const double dL = (j[1][1] * rx - j[0][1] * ry) / det;
        const double dP = (j[0][0] * ry - j[1][0] * rx) / det;
        L += dL;
        P += dP;
        if (!std::isfinite(L) || !std::isfinite(P)) return -1;
        if (std::fabs(dL) < kNewtonStepTolerance && std::fabs(dP) < kNewtonStepTolerance) break;
    }
    const double dfLon = L * c.dfLonScale + c.dfLonOffset;
    const double dfLat = P * c.dfLatScale + c.dfLatOffset;
    // Accepted only when it maps back onto the image position asked for.
    double dfCheckPixel = 0.0, dfCheckLine = 0.0;
    if (GroundToImage(dfLon, dfLat, dfZ, dfCheckPixel, dfCheckLine, bFlag) != 0 ||
        std::fabs(dfCheckPixel - dfPixel) > kInverseTolerancePixels ||
        std::fabs(dfCheckLine - dfLine) > kInverseTolerancePixels) {
        return -1;
    }
    dfX = std::remainder(dfLon, 360.0);
    dfY = dfLat;
    return 0;
}

const ogc::cs::ICRS* RpcMathModel::GetCRS() const {
    return mpoCRS;
}

MathModelType RpcMathModel::GetModelType() const {
    return MM_TYPE_RPC;
}

std::string RpcMathModel::GetModelName() const {
    return "RPC";
}

int RpcMathModel::GetNumColumns() const {
    return mnPixels;
}

int RpcMathModel::GetNumRows() const {
    return mnLines;
}

int RpcMathModel::GetDownsampleFactor() const {
    return mnDownsampleFactor;
}

int RpcMathModel::GetMinValidHeight(double& dfHeight) const {
    dfHeight = msCoefs.dfHeightOffset - kDomainLimit * std::fabs(msCoefs.dfHeightScale);
    return 0;
}

int RpcMathModel::GetMaxValidHeight(double& dfHeight) const {
    dfHeight = msCoefs.dfHeightOffset + kDomainLimit * std::fabs(msCoefs.dfHeightScale);
    return 0;
}

bool RpcMathModel::IsHeightDependent() const {
    return true;
}

bool RpcMathModel::IsEqual(const IMathModel* poOther) const {
    if (poOther == this) return true;
    const auto* poRpc = dynamic_cast<const RpcMathModel*>(poOther);
    if (poRpc == nullptr || poRpc->mnPixels != mnPixels || poRpc->mnLines != mnLines) return false;
    const RpcCoefficients& a = msCoefs;
    const RpcCoefficients& b = poRpc->msCoefs;
    const double sa[10] = {a.dfLineOffset,   a.dfLineScale,  a.dfPixelOffset, a.dfPixelScale,
                           a.dfLatOffset,    a.dfLatScale,   a.dfLonOffset,   a.dfLonScale,
                           a.dfHeightOffset, a.dfHeightScale};
    const double sb[10] = {b.dfLineOffset,   b.dfLineScale,  b.dfPixelOffset, b.dfPixelScale,
                           b.dfLatOffset,    b.dfLatScale,   b.dfLonOffset,   b.dfLonScale,
                           b.dfHeightOffset, b.dfHeightScale};
    return std::equal(sa, sa + 10, sb) &&
           std::equal(a.adfLineNum, a.adfLineNum + kRpcTerms, b.adfLineNum) &&
           std::equal(a.adfLineDen, a.adfLineDen + kRpcTerms, b.adfLineDen) &&
           std::equal(a.adfPixelNum, a.adfPixelNum + kRpcTerms, b.adfPixelNum) &&
           std::equal(a.adfPixelDen, a.adfPixelDen + kRpcTerms, b.adfPixelDen);
}

IMathModel* RpcMathModel::Clone() const {
    return new RpcMathModel(*this);
}

void RpcMathModel::SetDownsampleFactor(int nFactor) {
    mnDownsampleFactor = nFactor;
}

void RpcMathModel::SetRasterDimensions(int nPixels, int nLines) {
    mnPixels = std::max(nPixels, 0);
    mnLines = std::max(nLines, 0);
}

}  // namespace mathmodel
}  // namespace nova
