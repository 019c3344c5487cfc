// Thin plate spline: fit time (one TPSCalculate, both outputs) with the
// worst control-point misfit relative to the output extent, and evaluation
// throughput in control-point terms per second.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <cmath>
#include <random>
#include <vector>

#include "lumo.h"

namespace {

struct Points {
    std::vector<double> x, y, X, Y;
};

// Well-spread points: a jittered grid over a 30 km square mapped to a
// 6000 x 5000 image with smooth distortion.
Points Spread(int n) {
    std::mt19937 rng(17);
    std::uniform_real_distribution<double> jitter(-0.35, 0.35);
    const int side = static_cast<int>(std::ceil(std::sqrt(n)));
    Points p;
    for (int k = 0; k < n; ++k) {
        const double u = (k % side + 0.5 + jitter(rng)) / side;
        const double v = (k / side + 0.5 + jitter(rng)) / side;
        p.x.push_back(350000.0 + 30000.0 * u);
        p.y.push_back(4100000.0 + 30000.0 * v);
        p.X.push_back(6000.0 * u + 40.0 * std::sin(5.0 * v) + 12.0 * u * v);
        p.Y.push_back(5000.0 * (1.0 - v) + 25.0 * std::cos(4.0 * u));
    }
    return p;
}

double WorstMisfit(TPSInfo_t& t, const Points& p) {
    double worst = 0.0;
    for (std::size_t i = 0; i < p.x.size(); ++i) {
        double X = 0.0, Y = 0.0;
        TPSTransform(&t, p.x[i], p.y[i], &X, &Y);
        worst = std::max({worst, std::abs(X - p.X[i]) / 6000.0, std::abs(Y - p.Y[i]) / 5000.0});
    }
    return worst;
}

void BM_TpsFit(benchmark::State& state) {
    const int n = static_cast<int>(state.range(0));
    Points p = Spread(n);
    TPSInfo_t t(n);
    for (auto _ : state) {
        TPSCalculate(&t, n, p.x.data(), p.y.data(), p.X.data(), p.Y.data());
        benchmark::DoNotOptimize(t.padfCoefX[3]);
    }
    state.counters["misfit_rel"] = WorstMisfit(t, p);
    state.counters["rank"] = t.nRank;
}
BENCHMARK(BM_TpsFit)->Arg(1000)->Unit(benchmark::kMillisecond)->Iterations(5)->UseRealTime();
BENCHMARK(BM_TpsFit)->Arg(3000)->Unit(benchmark::kMillisecond)->Iterations(2)->UseRealTime();

void BM_TpsTransform(benchmark::State& state) {
    const int n = static_cast<int>(state.range(0));
    Points p = Spread(n);
    TPSInfo_t t(n);
    TPSCalculate(&t, n, p.x.data(), p.y.data(), p.X.data(), p.Y.data());
    double x = 351000.0;
    for (auto _ : state) {
        double X = 0.0, Y = 0.0;
        TPSTransform(&t, x, 4110000.0, &X, &Y);
        benchmark::DoNotOptimize(X);
        benchmark::DoNotOptimize(Y);
        x += 0.5;
    }
    state.SetItemsProcessed(state.iterations());
    state.counters["terms_per_s"] = benchmark::Counter(static_cast<double>(state.iterations()) * n,
                                                       benchmark::Counter::kIsRate);
}
BENCHMARK(BM_TpsTransform)->Arg(1000)->Arg(3000);

}  // namespace
