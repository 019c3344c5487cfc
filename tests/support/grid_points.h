// Point pairs on a jittered grid, as the parallel arrays that the fits over
// control points take.
#pragma once

#include <cmath>
#include <functional>
#include <random>
#include <vector>

namespace lumo {
namespace support {

// Pairs (x, y) -> (X, Y).
struct PointPairs {
    std::vector<double> x, y, X, Y;
    void Add(double px, double py, double pX, double pY) {
        x.push_back(px);
        y.push_back(py);
        X.push_back(pX);
        Y.push_back(pY);
    }
    int Size() const { return static_cast<int>(x.size()); }
};

// n well-spread points over [x0, x0 + w] x [y0, y0 + w]: a grid whose points
// move at most 0.3 of a cell, mapped by f.
inline PointPairs JitteredGrid(int n, double x0, double y0, double w, unsigned seed,
                               const std::function<void(double, double, double&, double&)>& f) {
    std::mt19937 rng(seed);
    std::uniform_real_distribution<double> jitter(-0.3, 0.3);
    const int side = static_cast<int>(std::ceil(std::sqrt(n)));
    PointPairs p;
    for (int k = 0; k < n; ++k) {
        const double x = x0 + w * (k % side + 0.5 + jitter(rng)) / side;
        const double y = y0 + w * (k / side + 0.5 + jitter(rng)) / side;
        double X = 0.0, Y = 0.0;
        f(x, y, X, Y);
        p.Add(x, y, X, Y);
    }
    return p;
}

}  // namespace support
}  // namespace lumo
