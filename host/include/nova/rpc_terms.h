// The 20 terms of a rational polynomial in normalised ground coordinates
// (u, v, w): longitude or X, latitude or Y, height. One definition for the
// host's rational polynomial models and the library's rational functions;
// inline so that both evaluate it without a call.
#pragma once

namespace nova {

constexpr int kRpcTermCount = 20;
// The derivatives of a cubic in (u, v, w) are quadratics: the first ten
// terms span them.
constexpr int kRpcQuadraticTerms = 10;

// The terms of (u, v, w) in t[0..19]. T is double, or a vector of doubles
// (the compiler's vector extension) holding several points' values.
template <typename T>
inline void RpcTermValues(T u, T v, T w, T* t) {
    t[0] = T{} + 1.0;
    t[1] = u;
    t[2] = v;
    t[3] = w;
    t[4] = u * v;
    t[5] = u * w;
    t[6] = v * w;
    t[7] = u * u;
    t[8] = v * v;
    t[9] = w * w;
    t[10] = u * v * w;
    t[11] = u * u * u;
    t[12] = u * v * v;
    t[13] = u * w * w;
    t[14] = u * u * v;
    t[15] = v * v * v;
    t[16] = v * w * w;
    t[17] = u * u * w;
    t[18] = v * v * w;
    t[19] = w * w * w;
}

// Derivatives of the 20 terms by u (pdu) and by v (pdv).
inline void RpcTermDerivatives(double u, double v, double w, double* pdu, double* pdv) {
    const double du[kRpcTermCount] = {0.0,       1.0, 0.0, 0.0,       v,         w,     0.0,
                                      2 * u,     0.0, 0.0, v * w,     3 * u * u, v * v, w * w,
                                      2 * u * v, 0.0, 0.0, 2 * u * w, 0.0,       0.0};
    const double dv[kRpcTermCount] = {0.0,   0.0,       1.0,   0.0,   u,         0.0,       w,
                                      0.0,   2 * v,     0.0,   u * w, 0.0,       2 * u * v, 0.0,
                                      u * u, 3 * v * v, w * w, 0.0,   2 * v * w, 0.0};
    for (int k = 0; k < kRpcTermCount; ++k) {
        pdu[k] = du[k];
        pdv[k] = dv[k];
    }
}

// Coefficients, on the first ten terms, of the derivatives by u and by v of
// the polynomial with the 20 coefficients c: a polynomial's derivatives at
// many points then cost two short sums each.
inline void RpcDerivativeCoefficients(const double* c, double* pdu, double* pdv) {
    const double du[kRpcQuadraticTerms] = {c[1],      2 * c[7], c[4],      c[5],  2 * c[14],
                                           2 * c[17], c[10],    3 * c[11], c[12], c[13]};
    const double dv[kRpcQuadraticTerms] = {c[2],  c[4],      2 * c[8], c[6],      2 * c[12],
                                           c[10], 2 * c[18], c[14],    3 * c[15], c[16]};
    for (int k = 0; k < kRpcQuadraticTerms; ++k) {
        pdu[k] = du[k];
        pdv[k] = dv[k];
    }
}

}  // namespace nova
