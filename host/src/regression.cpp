// Polynomial regression between two planes from control points.
//
// Both coordinate pairs are centred and scaled before solving so that the
// design matrix stays well conditioned even for UTM-sized inputs and order 5;
// the fit is evaluated in those normalised coordinates, and the raw-coordinate
// coefficients are derived from it for callers that read them.
#include <Eigen/Dense>
#include <algorithm>
#include <cmath>
#include <cstring>

#include "regression.h"
#include "runtime.h"

namespace {

// Exponents of u and v of each term, in the record's term order.
constexpr int kTermPowers[GCP_MAX_TERMS][2] = {
    {0, 0}, {1, 0}, {0, 1}, {1, 1}, {2, 0}, {0, 2}, {2, 1}, {1, 2}, {3, 0}, {0, 3}, {2, 2},
    {3, 1}, {1, 3}, {4, 0}, {0, 4}, {3, 2}, {2, 3}, {4, 1}, {1, 4}, {5, 0}, {0, 5}};

// Relative size below which a pivot of the design matrix counts as zero: the
// points then do not determine the polynomial.
constexpr double kRankThreshold = 1e-10;

// A spread this small relative to the coordinates' magnitude is rounding
// noise: the points coincide.
constexpr double kCoincidentSpread = 1e-12;

int TermsForOrder(int order) {
    return (order + 1) * (order + 2) / 2;
}

int TermIndex(int pu, int pv) {
    for (int k = 0; k < GCP_MAX_TERMS; ++k)
        if (kTermPowers[k][0] == pu && kTermPowers[k][1] == pv) return k;
    return -1;
}

void EvaluateTerms(double u, double v, int nTerms, double* terms) {
    double up[GCP_MAX_ORDER + 1];
    double vp[GCP_MAX_ORDER + 1];
    up[0] = vp[0] = 1.0;
    for (int i = 1; i <= GCP_MAX_ORDER; ++i) {
        up[i] = up[i - 1] * u;
        vp[i] = vp[i - 1] * v;
    }
    for (int k = 0; k < nTerms; ++k) terms[k] = up[kTermPowers[k][0]] * vp[kTermPowers[k][1]];
}

[[noreturn]] void Fail(const char* text) {
    nova::RaiseNumbered(nova::kMsgComputationFailed, text);
}

struct Points {
    const double* x1;
    const double* y1;
    const double* x2;
    const double* y2;
    int n;
};

void CheckPoints(const Points& p) {
    if (!p.x1 || !p.y1 || !p.x2 || !p.y2) Fail(_("Control point arrays must not be null."));
    if (p.n < 1) Fail(MkName(_("Invalid number of control points %d: at least 1 needed."), p.n));
    const double* arrays[4] = {p.x1, p.y1, p.x2, p.y2};
    const char* names[4] = {"x1", "y1", "x2", "y2"};
    for (int a = 0; a < 4; ++a)
        for (int i = 0; i < p.n; ++i)
            if (!std::isfinite(arrays[a][i]))
                Fail(MkName(_("Control point %d has a non-finite coordinate %s = %g."), i + 1,
                            names[a], arrays[a][i]));
}

void CheckOrder(int order) {
    if (order < 1 || order > GCP_MAX_ORDER)
        Fail(MkName(_("Invalid polynomial order %d: expected 1 to %d."), order, GCP_MAX_ORDER));
}

// Centre and half-range of one coordinate; the half-range is 0 when all
// values coincide (to rounding).
struct AxisRange {
    double dfCentre;
    double dfHalfRange;
};

AxisRange MeasureAxis(const double* values, int n, const char* name) {
    const auto [lo, hi] = std::minmax_element(values, values + n);
    AxisRange r{0.5 * *lo + 0.5 * *hi, 0.5 * *hi - 0.5 * *lo};
    if (!std::isfinite(r.dfHalfRange))
        Fail(MkName(_("Range of coordinate %s is too large: %g to %g."), name, *lo, *hi));
    if (r.dfHalfRange <= kCoincidentSpread * std::max(1.0, std::abs(r.dfCentre)))
        r.dfHalfRange = 0.0;
    return r;
}

// Normalised copy of the points: u = (x - centre) / scale for each coordinate.
struct Normalised {
    Eigen::VectorXd u, v, U, V;
    bool bInputsCoincide;
};

Normalised Normalise(const Points& p, GEOInfo_t& g) {
    const AxisRange rx = MeasureAxis(p.x1, p.n, "x1");
    const AxisRange ry = MeasureAxis(p.y1, p.n, "y1");
    const AxisRange rX = MeasureAxis(p.x2, p.n, "x2");
    const AxisRange rY = MeasureAxis(p.y2, p.n, "y2");
    // A degenerate axis borrows the other's scale so the terms stay balanced.
    const double inFallback = std::max({rx.dfHalfRange, ry.dfHalfRange, 0.0});
    const double outFallback = std::max({rX.dfHalfRange, rY.dfHalfRange, 0.0});
    auto scaleOf = [](double half, double fallback) {
        return half > 0.0 ? half : (fallback > 0.0 ? fallback : 1.0);
    };
    g.dfInXOffset = rx.dfCentre;
    g.dfInYOffset = ry.dfCentre;
    g.dfInXScale = scaleOf(rx.dfHalfRange, inFallback);
    g.dfInYScale = scaleOf(ry.dfHalfRange, inFallback);
    g.dfOutXOffset = rX.dfCentre;
    g.dfOutYOffset = rY.dfCentre;
    g.dfOutXScale = scaleOf(rX.dfHalfRange, outFallback);
    g.dfOutYScale = scaleOf(rY.dfHalfRange, outFallback);

    Normalised s;
    s.bInputsCoincide = inFallback == 0.0;
    s.u.resize(p.n);
    s.v.resize(p.n);
    s.U.resize(p.n);
    s.V.resize(p.n);
    for (int i = 0; i < p.n; ++i) {
        s.u[i] = (p.x1[i] - g.dfInXOffset) / g.dfInXScale;
        s.v[i] = (p.y1[i] - g.dfInYOffset) / g.dfInYScale;
        s.U[i] = (p.x2[i] - g.dfOutXOffset) / g.dfOutXScale;
        s.V[i] = (p.y2[i] - g.dfOutYOffset) / g.dfOutYScale;
    }
    return s;
}

// Least-squares polynomial of the given order in normalised coordinates.
// False when the points do not determine it (rank-deficient design).
bool FitPolynomial(const Normalised& s, int order, GEOInfo_t& g) {
    const int nTerms = TermsForOrder(order);
    const Eigen::Index n = s.u.size();
    if (n < nTerms) return false;
    Eigen::MatrixXd design(n, nTerms);
    double terms[GCP_MAX_TERMS];
    for (Eigen::Index i = 0; i < n; ++i) {
        EvaluateTerms(s.u[i], s.v[i], nTerms, terms);
        for (int k = 0; k < nTerms; ++k) design(i, k) = terms[k];
    }
    Eigen::ColPivHouseholderQR<Eigen::MatrixXd> qr(design);
    qr.setThreshold(kRankThreshold);
    if (qr.rank() < nTerms) return false;
    Eigen::MatrixXd rhs(n, 2);
    rhs.col(0) = s.U;
    rhs.col(1) = s.V;
    const Eigen::MatrixXd coef = qr.solve(rhs);
    std::fill(std::begin(g.adfNormXCoeffs), std::end(g.adfNormXCoeffs), 0.0);
    std::fill(std::begin(g.adfNormYCoeffs), std::end(g.adfNormYCoeffs), 0.0);
    for (int k = 0; k < nTerms; ++k) {
        g.adfNormXCoeffs[k] = coef(k, 0);
        g.adfNormYCoeffs[k] = coef(k, 1);
    }
    g.nOrder = order;
    g.nTerms = nTerms;
    g.nFitKind = GCP_FIT_POLYNOMIAL;
    return true;
}

// Stores a first-order map given about the centroid (mu, mv) of the
// normalised inputs and (mU, mV) of the outputs, all in normalised units:
// U = mU + a (u - mu) + b (v - mv), V = mV + c (u - mu) + d (v - mv).
void StoreCentredAffine(GEOInfo_t& g, double mu, double mv, double mU, double mV, double a,
                        double b, double c, double d, int kind) {
    std::fill(std::begin(g.adfNormXCoeffs), std::end(g.adfNormXCoeffs), 0.0);
    std::fill(std::begin(g.adfNormYCoeffs), std::end(g.adfNormYCoeffs), 0.0);
    g.adfNormXCoeffs[0] = mU - a * mu - b * mv;
    g.adfNormXCoeffs[1] = a;
    g.adfNormXCoeffs[2] = b;
    g.adfNormYCoeffs[0] = mV - c * mu - d * mv;
    g.adfNormYCoeffs[1] = c;
    g.adfNormYCoeffs[2] = d;
    g.nOrder = 1;
    g.nTerms = 3;
    g.nFitKind = kind;
}

// Rotation, scale and shift (or a plain shift when the inputs coincide),
// fitted in raw units about the centroids so that the rotation is not
// distorted by unequal axis scales.
void FitSimilarityOrShift(const Normalised& s, GEOInfo_t& g) {
    const double sx = g.dfInXScale, sy = g.dfInYScale, sX = g.dfOutXScale, sY = g.dfOutYScale;
    const double mu = s.u.mean(), mv = s.v.mean(), mU = s.U.mean(), mV = s.V.mean();
    if (s.bInputsCoincide) {
        // X - mX = x - mx in raw units.
        StoreCentredAffine(g, mu, mv, mU, mV, sx / sX, 0.0, 0.0, sy / sY, GCP_FIT_SHIFT);
        return;
    }
    double sxx = 0.0, sxy = 0.0, syx = 0.0;
    for (Eigen::Index i = 0; i < s.u.size(); ++i) {
        const double dx = (s.u[i] - mu) * sx, dy = (s.v[i] - mv) * sy;
        const double dX = (s.U[i] - mU) * sX, dY = (s.V[i] - mV) * sY;
        sxx += dx * dx + dy * dy;
        sxy += dx * dX + dy * dY;
        syx += dx * dY - dy * dX;
    }
    // Raw map: X - mX = p dx - q dy, Y - mY = q dx + p dy.
    const double p = sxy / sxx, q = syx / sxx;
    StoreCentredAffine(g, mu, mv, mU, mV, p * sx / sX, -q * sy / sX, q * sx / sY, p * sy / sY,
                       GCP_FIT_SIMILARITY);
}

// Expands the normalised polynomial into raw-coordinate coefficients.
void DeriveRawCoefficients(GEOInfo_t& g) {
    std::fill(std::begin(g.adfXCoeffs), std::end(g.adfXCoeffs), 0.0);
    std::fill(std::begin(g.adfYCoeffs), std::end(g.adfYCoeffs), 0.0);
    // Binomial expansion of ((x - ox) / sx)^i as coefficients of x^a.
    auto expand = [](double offset, double scale, int power, double* out) {
        double binom = 1.0;
        for (int a = 0; a <= power; ++a) {
            out[a] = binom * std::pow(-offset, power - a) / std::pow(scale, power);
            binom = binom * (power - a) / (a + 1);
        }
    };
    for (int k = 0; k < g.nTerms; ++k) {
        const int pu = kTermPowers[k][0], pv = kTermPowers[k][1];
        double eu[GCP_MAX_ORDER + 1], ev[GCP_MAX_ORDER + 1];
        expand(g.dfInXOffset, g.dfInXScale, pu, eu);
        expand(g.dfInYOffset, g.dfInYScale, pv, ev);
        for (int a = 0; a <= pu; ++a)
            for (int b = 0; b <= pv; ++b) {
                const int target = TermIndex(a, b);
                g.adfXCoeffs[target] += g.adfNormXCoeffs[k] * eu[a] * ev[b] * g.dfOutXScale;
                g.adfYCoeffs[target] += g.adfNormYCoeffs[k] * eu[a] * ev[b] * g.dfOutYScale;
            }
    }
    g.adfXCoeffs[0] += g.dfOutXOffset;
    g.adfYCoeffs[0] += g.dfOutYOffset;
}

// Fits the highest order up to `order` that the points determine, lowering
// to a similarity or shift when not even the affine map is determined.
GEOInfo_t FitRecord(const Points& p, int order) {
    GEOInfo_t g{};
    g.nPoints = p.n;
    const Normalised s = Normalise(p, g);
    bool fitted = false;
    for (int o = order; o >= 1 && !fitted; --o) fitted = FitPolynomial(s, o, g);
    if (!fitted) FitSimilarityOrShift(s, g);
    DeriveRawCoefficients(g);
    return g;
}

bool AllFinite(const double* values, int count) {
    for (int i = 0; i < count; ++i)
        if (!std::isfinite(values[i])) return false;
    return true;
}

void WarnIfLowered(const GEOInfo_t& g, int order) {
    if (g.nFitKind == GCP_FIT_SHIFT)
        IMPError(nova::kMsgComputationFailed, 0,
                 MkName(_("Polynomial order %d lowered to a shift: the %d control points "
                          "are all at one place."),
                        order, g.nPoints));
    else if (g.nFitKind == GCP_FIT_SIMILARITY)
        IMPError(nova::kMsgComputationFailed, 0,
                 MkName(_("Polynomial order %d lowered to a similarity transform: the %d control "
                          "points are fewer than 3 or collinear."),
                        order, g.nPoints));
    else if (g.nOrder < order)
        IMPError(nova::kMsgComputationFailed, 0,
                 MkName(_("Polynomial order %d lowered to %d: the %d control points do not "
                          "determine it."),
                        order, g.nOrder, g.nPoints));
}

void CopyUnit(char* dst, const char* src) {
    std::memset(dst, 0, GCP_UNIT_LEN);
    if (src) std::strncpy(dst, src, GCP_UNIT_LEN - 1);
}

// Fits the regression and its affine companion; the caller's record is
// written only once everything has succeeded.
GEOInfo_t FitWithAffine(const Points& p, int order) {
    CheckPoints(p);
    CheckOrder(order);
    GEOInfo_t g = FitRecord(p, order);
    const GEOInfo_t affine = order == 1 ? g : FitRecord(p, 1);
    for (int k = 0; k < 3; ++k) {
        g.adfAffine[k] = affine.adfXCoeffs[k];
        g.adfAffine[3 + k] = affine.adfYCoeffs[k];
    }
    if (!AllFinite(g.adfNormXCoeffs, GCP_MAX_TERMS) ||
        !AllFinite(g.adfNormYCoeffs, GCP_MAX_TERMS) || !AllFinite(g.adfAffine, 6))
        Fail(MkName(_("Regression of %d control points gave non-finite coefficients: the "
                      "coordinates are too large."),
                    p.n));
    WarnIfLowered(g, order);
    return g;
}

bool IsValidFit(const GEOInfo_t& g) {
    if (g.nOrder < 1 || g.nOrder > GCP_MAX_ORDER || g.nTerms != TermsForOrder(g.nOrder))
        return false;
    const double scales[4] = {g.dfInXScale, g.dfInYScale, g.dfOutXScale, g.dfOutYScale};
    for (const double s : scales)
        if (!(std::isfinite(s) && s > 0.0)) return false;
    return true;
}

void Evaluate(const GEOInfo_t& g, double x, double y, double* outX, double* outY) {
    double terms[GCP_MAX_TERMS];
    EvaluateTerms((x - g.dfInXOffset) / g.dfInXScale, (y - g.dfInYOffset) / g.dfInYScale, g.nTerms,
                  terms);
    double sumX = 0.0, sumY = 0.0;
    for (int k = g.nTerms - 1; k >= 0; --k) {
        sumX += g.adfNormXCoeffs[k] * terms[k];
        sumY += g.adfNormYCoeffs[k] * terms[k];
    }
    *outX = g.dfOutXOffset + g.dfOutXScale * sumX;
    *outY = g.dfOutYOffset + g.dfOutYScale * sumY;
}

void RootMeanSquare(const GEOInfo_t& g, const Points& p, double* rmsX, double* rmsY) {
    double sumX = 0.0, sumY = 0.0;
    for (int i = 0; i < p.n; ++i) {
        double fx = 0.0, fy = 0.0;
        Evaluate(g, p.x1[i], p.y1[i], &fx, &fy);
        sumX += (fx - p.x2[i]) * (fx - p.x2[i]);
        sumY += (fy - p.y2[i]) * (fy - p.y2[i]);
    }
    *rmsX = p.n > 0 ? std::sqrt(sumX / p.n) : 0.0;
    *rmsY = p.n > 0 ? std::sqrt(sumY / p.n) : 0.0;
}

}  // namespace

int GCPRegression(GEOInfo_t* psInfo, double* x1, double* y1, double* x2, double* y2, int n,
                  int* options, double* /*work1*/, double* /*work2*/) {
    if (!psInfo) Fail(_("GCPRegression: the regression record must not be null."));
    const int order = options ? options[0] : 1;
    const GEOInfo_t g = FitWithAffine(Points{x1, y1, x2, y2, n}, order);
    *psInfo = g;
    return 0;
}

int GCPRegression2(GEOInfo_t* psInfo, const char* fromUnit, double* x1, double* y1,
                   const char* toUnit, double* x2, double* y2, int n, int* order, int /*nFlag*/,
                   double* pdfRmsX, double* pdfRmsY) {
    if (!psInfo) Fail(_("GCPRegression2: the regression record must not be null."));
    const Points p{x1, y1, x2, y2, n};
    GEOInfo_t g = FitWithAffine(p, order ? *order : 1);
    CopyUnit(g.szFromUnit, fromUnit);
    CopyUnit(g.szToUnit, toUnit);
    double rmsX = 0.0, rmsY = 0.0;
    if (pdfRmsX || pdfRmsY) RootMeanSquare(g, p, &rmsX, &rmsY);
    *psInfo = g;
    if (order) *order = g.nOrder;
    if (pdfRmsX) *pdfRmsX = rmsX;
    if (pdfRmsY) *pdfRmsY = rmsY;
    return 0;
}

int GCPTransform(const GEOInfo_t* psInfo, double x, double y, double* outX, double* outY) {
    double fx = 0.0, fy = 0.0;
    const bool ok = psInfo && IsValidFit(*psInfo) && std::isfinite(x) && std::isfinite(y);
    if (ok) Evaluate(*psInfo, x, y, &fx, &fy);
    if (outX) *outX = fx;
    if (outY) *outY = fy;
    return ok ? 0 : -1;
}

int GCPRootMeanSq(GEOInfo_t* psInfo, double* x1, double* y1, double* x2, double* y2, int n,
                  double* rmsX, double* rmsY) {
    if (!psInfo || !IsValidFit(*psInfo))
        Fail(_("GCPRootMeanSq: the regression record holds no fitted regression."));
    if (!rmsX || !rmsY) Fail(_("GCPRootMeanSq: the result pointers must not be null."));
    if (n == 0) {
        *rmsX = *rmsY = 0.0;
        return 0;
    }
    const Points p{x1, y1, x2, y2, n};
    CheckPoints(p);
    RootMeanSquare(*psInfo, p, rmsX, rmsY);
    return 0;
}
