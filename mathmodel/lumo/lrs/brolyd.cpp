// Analytic orbit propagation: Brouwer's theory of the zonal harmonics J2 to
// J5 in Lyddane's non-singular form (secular, long-period and short-period
// terms), the conversion of elements to position and velocity, and the
// Kepler equation.
//
// Inside Brolyd lengths are Earth radii and time is in units of
// sqrt(Re^3 / mu) seconds; k2..k5 are Brouwer's constants -C20/2, C30,
// 3 C40 / 8 and C50.
#include <algorithm>
#include <cmath>

#include "errors.h"
#include "lrs_internal.h"
#include "lumo_lrs.h"
#include "runtime.h"

namespace lumo::lrs {
namespace {

constexpr double kKeplerTolerance = 5e-17;
constexpr int kKeplerSteps = 12;
constexpr int kCelemSteps = 11;
// Brouwer's constants of the Earth model.
constexpr double kK2 = -0.5 * LRS_C20;
constexpr double kK3 = LRS_C30;
constexpr double kK4 = 0.375 * LRS_C40;
constexpr double kK5 = LRS_C50;
// Above this value of 25 |cos i|^5 gamma2' e^2 / (1 - 5 cos^2 i)^2 the
// long-period terms are dropped (near the critical inclinations).
constexpr double kCriticalLimit = 0.01;
// Width, in 1 - 5 cos^2 i, of the band around the critical inclinations
// where the divisor of the long-period terms is smoothly bounded.
constexpr double kDivisorBand = 0.05;

// Seconds to canonical time units.
double CanonicalRate() {
    static const double dfRate =
        std::sqrt(LRS_MU / (LRS_EARTH_RADIUS * LRS_EARTH_RADIUS * LRS_EARTH_RADIUS));
    return dfRate;
}

// Eccentric anomaly of mean anomaly M, in (-2 pi, 2 pi) (the sign of fmod).
double SolveKepler(double M, double e) {
    if (M == 0.0) return 0.0;
    double E = M + e * std::sin(M);
    for (int k = 0; k < kKeplerSteps; ++k) {
        const double f = E - e * std::sin(E) - M;
        const double dfNext = E - f / (1.0 - e * std::cos(E - 0.5 * f));
        const bool bDone = std::fabs(dfNext - E) <= kKeplerTolerance;
        E = dfNext;
        if (bDone) break;
    }
    return std::fmod(E, kTwoPi);
}

// 1 / (1 - 5 cos^2 i), bounded near the critical inclinations: the factor
// (1 - exp(-(D / band)^2)) leaves it unchanged (to double precision) a few
// band widths away and takes it smoothly through 0 where D = 0, so that the
// long-period terms stay finite at any eccentricity.
double GuardedCriticalDivisor(double D) {
    const double x = D / kDivisorBand;
    if (std::fabs(x) < 1e-4) return D / (kDivisorBand * kDivisorBand);
    return -std::expm1(-x * x) / D;
}

// Quantities of the mean elements that every term uses.
struct MeanOrbit {
    double a;  // Earth radii
    double e, e2;
    double eta, eta2, eta3;
    double c, c2, s;    // cosine, its square, sine of the inclination
    double g2, gp2;     // gamma2 and gamma2'
    double r3, r4, r5;  // gamma3', gamma4', gamma5' over gamma2'
    double T;           // guarded 1 / (1 - 5 cos^2 i)
};

MeanOrbit Prepare(const double* padfMean) {
    MeanOrbit m{};
    m.a = padfMean[LRS_ELEM_A] / LRS_EARTH_RADIUS;
    m.e = padfMean[LRS_ELEM_E];
    m.e2 = m.e * m.e;
    m.eta2 = 1.0 - m.e2;
    m.eta = std::sqrt(m.eta2);
    m.eta3 = m.eta2 * m.eta;
    m.c = std::cos(padfMean[LRS_ELEM_I]);
    m.s = std::sin(padfMean[LRS_ELEM_I]);
    m.c2 = m.c * m.c;
    const double eta4 = m.eta2 * m.eta2;
    m.g2 = kK2 / (m.a * m.a);
    m.gp2 = m.g2 / eta4;
    const double gp3 = kK3 / (m.a * m.a * m.a * eta4 * m.eta2);
    const double gp4 = kK4 / (m.a * m.a * m.a * m.a * eta4 * eta4);
    const double gp5 = kK5 / (m.a * m.a * m.a * m.a * m.a * eta4 * eta4 * m.eta2);
    m.r3 = gp3 / m.gp2;
    m.r4 = gp4 / m.gp2;
    m.r5 = gp5 / m.gp2;
    m.T = GuardedCriticalDivisor(1.0 - 5.0 * m.c2);
    return m;
}

// Secular rates of the mean anomaly, perigee and node (canonical units).
struct SecularRates {
    double n0, dM, dPerigee, dNode;
};

SecularRates Rates(const MeanOrbit& m) {
    const double n = m.eta, n2 = m.eta2, c2 = m.c2, c4 = c2 * c2;
    const double gp2 = m.gp2;
    const double gp4 = m.r4 * gp2;
    SecularRates r{};
    r.n0 = std::sqrt(1.0 / (m.a * m.a * m.a));
    r.dM = r.n0 * n *
           (gp2 * (1.5 * (3.0 * c2 - 1.0) +
                   (3.0 / 32.0) * gp2 *
                       ((30.0 - 96.0 * n - 90.0 * n2) * c2 + (16.0 * n + 25.0 * n2 - 15.0) +
                        (144.0 * n + 25.0 * n2 + 105.0) * c4)) +
            (15.0 / 16.0) * gp4 * m.e2 * (3.0 - 30.0 * c2 + 35.0 * c4));
    r.dPerigee =
        r.n0 * (gp2 * (1.5 * (5.0 * c2 - 1.0) +
                       (3.0 / 32.0) * gp2 *
                           ((385.0 + 360.0 * n + 45.0 * n2) * c4 +
                            (90.0 - 192.0 * n - 126.0 * n2) * c2 + (25.0 * n2 + 24.0 * n - 35.0))) +
                (5.0 / 16.0) * gp4 *
                    ((385.0 - 189.0 * n2) * c4 + (126.0 * n2 - 270.0) * c2 - 9.0 * n2 + 21.0));
    r.dNode =
        r.n0 *
        (gp2 * ((3.0 / 8.0) * gp2 *
                    ((12.0 * n + 9.0 * n2 - 5.0) * m.c - (36.0 * n + 5.0 * n2 + 35.0) * c2 * m.c) -
                3.0 * m.c) +
         (5.0 / 4.0) * gp4 * m.c * (3.0 - 7.0 * c2) * (5.0 - 3.0 * n2));
    return r;
}

// Periodic corrections in Lyddane's variables: the eccentricity pair
// (e + de, e dl), the inclination pieces di and sin(i) dh, and dz, the
// correction of the mean longitude l + g + h.
struct Corrections {
    double de = 0, edl = 0, di = 0, sdh = 0, dz = 0;
};

bool NearCriticalInclination(const MeanOrbit& m) {
    // |cos i|^5 keeps the rule symmetric about 90 degrees (both critical
    // inclinations); the comparison avoids dividing by 1 - 5 cos^2 i.
    const double D = 1.0 - 5.0 * m.c2;
    const double c5 = std::pow(std::fabs(m.c), 5.0);
    return 25.0 * c5 * m.gp2 * m.e2 > kCriticalLimit * D * D;
}

// Long-period terms (J2 squared, J3, J4, J5), functions of the perigee g.
Corrections LongPeriod(const MeanOrbit& m, double g) {
    Corrections d;
    if (NearCriticalInclination(m)) return d;
    const double e = m.e, e2 = m.e2, c = m.c, c2 = m.c2, s = m.s, T = m.T;
    const double eta = m.eta, eta2 = m.eta2, eta3 = m.eta3;
    const double gp2 = m.gp2, r3 = m.r3, r4 = m.r4, r5 = m.r5;
    const double c4T = c2 * c2 * T;  // cos^4 i / (1 - 5 cos^2 i)
    const double c4T2 = c4T * T;
    // Inclination factors; those of the J2^2 / J4 and of the sin 3g term
    // carry sin^2 i explicitly so that nothing divides by sin i.
    const double fA_s = s * (1.0 - 15.0 * c2) * T;  // (1 - 11c2 - 40c4 T) / sin i
    const double fB_s = s * (1.0 - 7.0 * c2) * T;   // (1 - 3c2 - 8c4 T) / sin i
    const double fC = 1.0 - 9.0 * c2 - 24.0 * c4T;
    const double fD = s * s * (1.0 - 9.0 * c2) * T;                   // 1 - 5c2 - 16c4 T
    const double K2_s = gp2 * fA_s / 8.0 - (5.0 / 12.0) * r4 * fB_s;  // amplitude of cos 2g / sin i
    const double K2 = K2_s * s;
    const double K3 = r3 / 4.0 + (5.0 / 64.0) * r5 * (4.0 + 3.0 * e2) * fC;
    const double K3l = r3 / 4.0 + (5.0 / 64.0) * r5 * (4.0 + 9.0 * e2) * fC;
    const double K5 = (35.0 / 384.0) * r5 * e2 * fD;
    const double tanHalfI = s / (1.0 + c);

    const double sg = std::sin(g), cg = std::cos(g);
    const double s2g = std::sin(2.0 * g), c2g = std::cos(2.0 * g);
    const double s3g = std::sin(3.0 * g), c3g = std::cos(3.0 * g);

    d.de = eta2 * (e * K2 * c2g + s * K3 * sg - s * K5 * s3g);
    // H = G cos i is unchanged by the long-period terms: di = -e de / (eta^2 tan i).
    d.di = -e * c * (e * K2_s * c2g + K3 * sg - K5 * s3g);
    d.edl = eta3 * (e * K2 * s2g - s * K3l * cg + s * K5 * c3g);

    const double fG = 3.0 + 16.0 * c2 * T + 40.0 * c4T2;  // 3 + 16 c2 T + 40 c4 T^2
    const double fF = 11.0 + 80.0 * c2 * T + 200.0 * c4T2;
    const double fH = 5.0 + 32.0 * c2 * T + 80.0 * c4T2;
    const double b10 = s * e2 * c * ((5.0 / 12.0) * r4 * fG - gp2 * fF / 8.0);
    const double b11 = e * c *
                       ((5.0 / 64.0) * r5 * (4.0 + 3.0 * e2) * fC + r3 / 4.0 +
                        (15.0 / 32.0) * r5 * (4.0 + 3.0 * e2) * s * s * fG);
    const double b12 = -e2 * e * c * r5 * ((35.0 / 576.0) * s * s * fH + (35.0 / 1152.0) * fD);
    d.sdh = b10 * s2g + b11 * cg + b12 * c3g;

    // The mean longitude.
    const double a13 = c2 * (3.0 * e2 + 2.0);
    const double a14 = (5.0 * e2 + 2.0) * c4T;
    const double a15 = e2 * c2 * c4T2;
    const double a22 = e2 * c;
    const double b1 =
        eta3 * K2 -
        ((2.0 + e2 - 400.0 * a15 - 40.0 * a14 - 11.0 * a13) / 16.0 + fF * a22 / 8.0) * gp2 +
        ((2.0 + e2 - 80.0 * a15 - 8.0 * a14 - 3.0 * a13) * (5.0 / 24.0) + (5.0 / 12.0) * fG * a22) *
            r4;
    const double a18 = e * s;
    const double a19 = a18 / (1.0 + eta);
    const double a21 = e * c;
    const double r5C = r5 * fC;
    const double r5E = r5 * (3.0 * e2 + 4.0);
    const double b2 = (r3 / 4.0) * a19 * (2.0 + eta - e2) + (5.0 / 64.0) * r5E * fC * a19 * eta2 -
                      (15.0 / 32.0) * r5C * a18 * eta * eta2 +
                      ((5.0 / 64.0) * r5E * fC + r3 / 4.0) * a21 * tanHalfI +
                      (9.0 * e2 + 26.0) * (5.0 / 64.0) * r5C * a18 +
                      (15.0 / 32.0) * r5E * a21 * fG * s * (1.0 - c);
    const double r5De = r5 * e * fD;
    const double b3 =
        fH * a22 * s * (c - 1.0) * (35.0 / 576.0) * r5 * e -
        (a22 * tanHalfI + (2.0 * e2 + 3.0 * (1.0 - eta3)) * s) * (35.0 / 1152.0) * r5De;
    d.dz = b1 * s2g + b2 * cg + b3 * c3g;
    return d;
}

// Short-period terms of J2 at true anomaly f, mean anomaly M, perigee g.
Corrections ShortPeriod(const MeanOrbit& m, double f, double M, double g) {
    const double e = m.e, c = m.c, c2 = m.c2, s = m.s, eta = m.eta, eta2 = m.eta2;
    const double gp2 = m.gp2;
    const double cf = std::cos(f), sf = std::sin(f);
    const double ecf = e * cf;
    const double aOverR = (1.0 + ecf) / eta2;
    const double Ar = aOverR * aOverR * eta2 + aOverR;
    const double w20 = cf * (3.0 + 3.0 * ecf + ecf * ecf);
    const double t8 = eta + 1.0 / (1.0 + eta);
    const double c2gf = std::cos(2.0 * g + f), s2gf = std::sin(2.0 * g + f);
    const double c2g2f = std::cos(2.0 * g + 2.0 * f), s2g2f = std::sin(2.0 * g + 2.0 * f);
    const double c2g3f = std::cos(2.0 * g + 3.0 * f), s2g3f = std::sin(2.0 * g + 3.0 * f);
    const double p = 3.0 * c2 - 1.0, q = 1.0 - c2;
    // Equation of the centre plus e sin f, with f - M taken in [-pi, pi).
    const double w17 = WrapPi(f - M) + e * sf;
    const double w21 = 3.0 * s2g2f + 3.0 * e * s2gf + e * s2g3f;

    Corrections d;
    d.de = 0.5 * gp2 *
           (p * (w20 + e * t8) + 3.0 * q * (w20 + e) * c2g2f - eta2 * q * (3.0 * c2gf + c2g3f));
    d.edl = -0.25 * eta2 * eta * gp2 *
            (2.0 * p * (Ar + 1.0) * sf + 3.0 * q * ((1.0 - Ar) * s2gf + (Ar + 1.0 / 3.0) * s2g3f));
    d.di = 0.5 * gp2 * c * s * (3.0 * c2g2f + 3.0 * e * c2gf + e * c2g3f);
    d.sdh = -0.5 * gp2 * c * s * (6.0 * w17 - w21);
    d.dz = -e * d.edl / (eta * (1.0 + eta)) +
           0.25 * gp2 * (6.0 * (5.0 * c2 - 2.0 * c - 1.0) * w17 + (3.0 + 2.0 * c - 5.0 * c2) * w21);
    return d;
}

// Semi-major axis with the short-period term of J2 (Earth radii).
double OsculatingAxis(const MeanOrbit& m, double E, double f, double g) {
    const double e = m.e, ecf = m.e * std::cos(f);
    const double aOverR = 1.0 / (1.0 - e * std::cos(E));
    const double eta6 = m.eta2 * m.eta2 * m.eta2;
    return m.a *
           (1.0 +
            m.g2 *
                ((3.0 * m.c2 - 1.0) / eta6 *
                     (ecf * (3.0 + 3.0 * ecf + ecf * ecf) + m.e2 * (m.eta + 1.0 / (1.0 + m.eta))) +
                 3.0 * (1.0 - m.c2) * aOverR * aOverR * aOverR * std::cos(2.0 * g + 2.0 * f)));
}

[[noreturn]] void BadElement(const char* pszWhat, double dfValue) {
    Fatal(Err::kBadArgument,
          MkName(_("Brolyd: mean %s %.17g is outside the theory's range.\n"), pszWhat, dfValue));
}

void CheckArguments(double dfTime, const double* padfMean, int nMode, int nInit, int nAdvance) {
    if (nInit != 1)
        Fatal(Err::kBadArgument, MkName(_("Brolyd: nInit %d is not supported (1).\n"), nInit));
    if (nMode < 0 || nMode > 2) {
        Fatal(Err::kBadArgument, MkName(_("Brolyd: nMode %d is not 0, 1 or 2.\n"), nMode));
    }
    if (nAdvance != 0 && nAdvance != 1) {
        Fatal(Err::kBadArgument, MkName(_("Brolyd: nAdvance %d is not 0 or 1.\n"), nAdvance));
    }
    if (!std::isfinite(dfTime)) {
        Fatal(Err::kBadArgument, MkName(_("Brolyd: time %.17g is not finite.\n"), dfTime));
    }
    if (!(padfMean[LRS_ELEM_A] > 0.0) || !std::isfinite(padfMean[LRS_ELEM_A])) {
        BadElement("semi-major axis (km)", padfMean[LRS_ELEM_A]);
    }
    if (!(padfMean[LRS_ELEM_E] >= 0.0 && padfMean[LRS_ELEM_E] < 1.0)) {
        BadElement("eccentricity", padfMean[LRS_ELEM_E]);
    }
    if (!(padfMean[LRS_ELEM_I] >= 0.0 && padfMean[LRS_ELEM_I] < kPi)) {
        BadElement("inclination (rad)", padfMean[LRS_ELEM_I]);
    }
    for (int k = LRS_ELEM_NODE; k <= LRS_ELEM_MEAN_ANOMALY; ++k) {
        if (!std::isfinite(padfMean[k])) BadElement("angle (rad)", padfMean[k]);
    }
}

}  // namespace
}  // namespace lumo::lrs

using namespace lumo::lrs;  // NOLINT(google-build-using-namespace)
using lumo::Err;
using lumo::Fatal;

void Brolyd(double dfTime, double* padfOsc, double* padfMean, int nMode, int nInit, int nAdvance,
            double* padfAux) {
    CheckArguments(dfTime, padfMean, nMode, nInit, nAdvance);
    double adfEntry[LRS_NUM_ELEMENTS];
    std::copy(padfMean, padfMean + LRS_NUM_ELEMENTS, adfEntry);
    const MeanOrbit m = Prepare(padfMean);
    const SecularRates r = Rates(m);
    const double dfMeanMotion = (r.n0 + r.dM) * CanonicalRate();

    if (nMode == 0) {
        std::copy(adfEntry, adfEntry + LRS_NUM_ELEMENTS, padfOsc);
        padfAux[0] = padfAux[1] = padfAux[4] = 0.0;
        padfAux[2] = padfMean[LRS_ELEM_PERIGEE];
        padfAux[3] = dfMeanMotion;
        return;
    }

    const double tau = nAdvance ? dfTime * CanonicalRate() : 0.0;
    const double M = WrapTwoPi(padfMean[LRS_ELEM_MEAN_ANOMALY] + tau * (r.n0 + r.dM));
    const double g = WrapTwoPi(padfMean[LRS_ELEM_PERIGEE] + tau * r.dPerigee);
    const double h = WrapTwoPi(padfMean[LRS_ELEM_NODE] + tau * r.dNode);
    const double E = SolveKepler(M, m.e);
    const double f = WrapTwoPi(std::atan2(m.eta * std::sin(E), std::cos(E) - m.e));

    padfMean[LRS_ELEM_NODE] = h;
    padfMean[LRS_ELEM_PERIGEE] = g;
    padfMean[LRS_ELEM_MEAN_ANOMALY] = M;
    padfAux[0] = E;
    padfAux[1] = WrapTwoPi(f + g);
    padfAux[2] = g;
    padfAux[3] = dfMeanMotion;
    padfAux[4] = f;
    if (nMode == 1) {
        std::copy(adfEntry, adfEntry + LRS_NUM_ELEMENTS, padfOsc);
        return;
    }

    const Corrections lp = LongPeriod(m, g);
    const Corrections sp = ShortPeriod(m, f, M, g);
    // Eccentricity pair and mean anomaly.
    const double dfE1 = m.e + lp.de + sp.de;
    const double dfE2 = lp.edl + sp.edl;
    const double dfEcc = std::hypot(dfE1, dfE2);
    const double dfMOsc = dfEcc == 0.0 ? 0.0 : WrapTwoPi(M + std::atan2(dfE2, dfE1));
    // Inclination pair and node.
    const double dfHalf = 0.5 * std::acos(std::clamp(m.c, -1.0, 1.0));
    const double dfI1 = std::sin(dfHalf) + 0.5 * std::cos(dfHalf) * (lp.di + sp.di);
    const double dfI2 = (lp.sdh + sp.sdh) / (2.0 * std::cos(dfHalf));
    const double dfInc = WrapTwoPi(2.0 * std::asin(std::min(1.0, std::hypot(dfI1, dfI2))));
    const double dfNode = dfInc == 0.0 ? 0.0 : WrapTwoPi(h + std::atan2(dfI2, dfI1));
    const double dfL = M + g + h + lp.dz + sp.dz;

    padfOsc[LRS_ELEM_A] = OsculatingAxis(m, E, f, g) * LRS_EARTH_RADIUS;
    padfOsc[LRS_ELEM_E] = dfEcc;
    padfOsc[LRS_ELEM_I] = dfInc;
    padfOsc[LRS_ELEM_NODE] = dfNode;
    padfOsc[LRS_ELEM_PERIGEE] = WrapTwoPi(dfL - dfMOsc - dfNode);
    padfOsc[LRS_ELEM_MEAN_ANOMALY] = dfMOsc;
}

void Celem(double* padfElem, double* padfPos, double* padfVel) {
    const double a = padfElem[LRS_ELEM_A], e = padfElem[LRS_ELEM_E];
    for (int k = 0; k < LRS_NUM_ELEMENTS; ++k) {
        if (!std::isfinite(padfElem[k])) {
            Fatal(Err::kBadArgument,
                  MkName(_("Celem: element %d is %.17g, not a finite number.\n"), k, padfElem[k]));
        }
    }
    const bool bEllipse = a > 0.0 && e >= 0.0 && e < 1.0;
    const bool bHyperbola = a < 0.0 && e > 1.0;
    if (!bEllipse && !bHyperbola) {
        Fatal(Err::kBadArgument,
              MkName(_("Celem: semi-major axis %.17g km with eccentricity %.17g is neither an "
                       "ellipse nor a hyperbola.\n"),
                     a, e));
    }
    const double M = padfElem[LRS_ELEM_MEAN_ANOMALY];
    double x = 0, y = 0, vx = 0, vy = 0;
    if (bEllipse) {
        double E = M;
        for (int k = 0; k < kCelemSteps; ++k) {
            const double f = E - e * std::sin(E) - M;
            const double dfNext = E - f / (1.0 - e * std::cos(E - 0.5 * f));
            const bool bDone = std::fabs(E - dfNext) <= kKeplerTolerance;
            E = dfNext;
            if (bDone) break;
        }
        const double r = a * (1.0 - e * std::cos(E));
        x = a * (std::cos(E) - e);
        y = a * std::sqrt(1.0 - e * e) * std::sin(E);
        vx = -std::sqrt(LRS_MU * a) * std::sin(E) / r;
        vy = std::sqrt(LRS_MU * a * (1.0 - e * e)) * std::cos(E) / r;
    } else {
        double F = 0.5 * M;
        for (int k = 0; k < kCelemSteps; ++k) {
            const double f = e * std::sinh(F) - F - M;
            const double dfNext = F - f / (e * std::cosh(F - 0.5 * f) - 1.0);
            const bool bDone = std::fabs(F - dfNext) <= kKeplerTolerance;
            F = dfNext;
            if (bDone) break;
        }
        const double r = a * (1.0 - e * std::cosh(F));
        x = a * (std::cosh(F) - e);
        y = -a * std::sqrt(e * e - 1.0) * std::sinh(F);
        vx = -std::sqrt(-LRS_MU * a) * std::sinh(F) / r;
        vy = std::sqrt(-LRS_MU * a * (e * e - 1.0)) * std::cosh(F) / r;
    }
    const double ci = std::cos(padfElem[LRS_ELEM_I]), si = std::sin(padfElem[LRS_ELEM_I]);
    const double cO = std::cos(padfElem[LRS_ELEM_NODE]), sO = std::sin(padfElem[LRS_ELEM_NODE]);
    const double cw = std::cos(padfElem[LRS_ELEM_PERIGEE]);
    const double sw = std::sin(padfElem[LRS_ELEM_PERIGEE]);
    const double P[3] = {cO * cw - sO * sw * ci, sO * cw + cO * sw * ci, sw * si};
    const double Q[3] = {-cO * sw - sO * cw * ci, -sO * sw + cO * cw * ci, cw * si};
    for (int k = 0; k < 3; ++k) {
        padfPos[k] = x * P[k] + y * Q[k];
        padfVel[k] = vx * P[k] + vy * Q[k];
    }
}
