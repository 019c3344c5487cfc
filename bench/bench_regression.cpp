// Speed of the control point regression and of the pivoted QR solver at the
// sizes the spline fit uses (n control points give an (n + 3)-square system).
#include <benchmark/benchmark.h>

#include <cmath>
#include <random>
#include <vector>

#include "regression.h"

namespace {

void BM_GCPRegression2Order3(benchmark::State& state) {
    const int n = static_cast<int>(state.range(0));
    std::mt19937 rng(1);
    std::uniform_real_distribution<double> d(0.0, 1.0);
    std::vector<double> x1(n), y1(n), x2(n), y2(n);
    for (int i = 0; i < n; ++i) {
        x1[i] = 400000.0 + 60000.0 * d(rng);
        y1[i] = 5000000.0 + 60000.0 * d(rng);
        const double u = (x1[i] - 430000.0) / 1000.0, v = (y1[i] - 5030000.0) / 1000.0;
        x2[i] = 3000.0 + 33.0 * u + 0.01 * u * v + 1e-4 * u * u * u;
        y2[i] = 3000.0 - 33.0 * v + 0.02 * u * u;
    }
    GEOInfo_t info;
    for (auto _ : state) {
        int order = 3;
        GCPRegression2(&info, "METRE", x1.data(), y1.data(), "PIXEL", x2.data(), y2.data(), n,
                       &order, 0, nullptr, nullptr);
        benchmark::DoNotOptimize(info.adfXCoeffs[0]);
    }
}
BENCHMARK(BM_GCPRegression2Order3)->Arg(10000)->Unit(benchmark::kMillisecond);

// A spline-like system: symmetric, r² ln r² kernel of random points bordered
// by the affine columns.
std::vector<double> SplineSystem(int nPoints) {
    const int n = nPoints + 3;
    std::mt19937 rng(2);
    std::uniform_real_distribution<double> d(0.0, 1.0);
    std::vector<double> px(nPoints), py(nPoints);
    for (int i = 0; i < nPoints; ++i) {
        px[i] = d(rng);
        py[i] = d(rng);
    }
    std::vector<double> a(static_cast<size_t>(n) * n, 0.0);
    auto at = [&](int i, int j) -> double& { return a[static_cast<size_t>(j) * n + i]; };
    for (int i = 0; i < nPoints; ++i) {
        at(3 + i, 0) = at(0, 3 + i) = 1.0;
        at(3 + i, 1) = at(1, 3 + i) = px[i];
        at(3 + i, 2) = at(2, 3 + i) = py[i];
        for (int j = i + 1; j < nPoints; ++j) {
            const double r2 = (px[i] - px[j]) * (px[i] - px[j]) + (py[i] - py[j]) * (py[i] - py[j]);
            at(3 + i, 3 + j) = at(3 + j, 3 + i) = r2 > 0.0 ? r2 * std::log(r2) : 0.0;
        }
    }
    return a;
}

void BM_DqrlscFactoriseAndSolve(benchmark::State& state) {
    const int nPoints = static_cast<int>(state.range(0)) - 3;
    const int n = nPoints + 3;
    const std::vector<double> original = SplineSystem(nPoints);
    std::vector<double> a(original.size()), b(n, 1.0), x(n), rsd(n), qraux(n);
    std::vector<int> jpvt(n);
    for (auto _ : state) {
        state.PauseTiming();
        a = original;
        state.ResumeTiming();
        int rank = 0, ind = 0;
        dqrlsc(a.data(), n, n, 1e-12, &rank, b.data(), x.data(), rsd.data(), jpvt.data(),
               qraux.data(), nullptr, -1, &ind);
        dqrlsc(a.data(), n, n, 1e-12, &rank, b.data(), x.data(), rsd.data(), jpvt.data(),
               qraux.data(), nullptr, 2, &ind);
        benchmark::DoNotOptimize(x[0]);
        state.counters["rank"] = rank;
    }
}
BENCHMARK(BM_DqrlscFactoriseAndSolve)->Arg(1003)->Unit(benchmark::kMillisecond)->Iterations(5);
BENCHMARK(BM_DqrlscFactoriseAndSolve)->Arg(3003)->Unit(benchmark::kMillisecond)->Iterations(1);

}  // namespace
