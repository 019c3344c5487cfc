// The terms of a polynomial in (u, v) up to the fifth order, in the order
// the polynomial model and the regression over control points number them,
// written out independently of the library.
#pragma once

#include <cmath>

namespace lumo {
namespace support {

// Powers of u and v of each of the 21 terms.
constexpr int kTermPowers[21][2] = {{0, 0}, {1, 0}, {0, 1}, {1, 1}, {2, 0}, {0, 2}, {2, 1},
                                    {1, 2}, {3, 0}, {0, 3}, {2, 2}, {3, 1}, {1, 3}, {4, 0},
                                    {0, 4}, {3, 2}, {2, 3}, {4, 1}, {1, 4}, {5, 0}, {0, 5}};

// The sum of the first nTerms terms with coefficients c, in long double.
inline double TermSum(const double* c, int nTerms, double u, double v) {
    long double sum = 0;
    for (int k = 0; k < nTerms; ++k) {
        sum += static_cast<long double>(c[k]) *
               std::pow(static_cast<long double>(u), kTermPowers[k][0]) *
               std::pow(static_cast<long double>(v), kTermPowers[k][1]);
    }
    return static_cast<double>(sum);
}

}  // namespace support
}  // namespace lumo
