// Polynomial model evaluation, direct and through the generic dispatch.
#include <benchmark/benchmark.h>

#include <memory>
#include <random>
#include <vector>

#include "lumo.h"

namespace {

struct PolyDeleter {
    void operator()(POLYInfo_t* p) const { POLYDeallocate(p); }
};

std::unique_ptr<POLYInfo_t, PolyDeleter> MakeModel(int nCoeffs) {
    std::unique_ptr<POLYInfo_t, PolyDeleter> p(POLYAllocate());
    p->nCoeffs = nCoeffs;
    std::mt19937 oRng(7);
    std::uniform_real_distribution<double> oCoef(-1e-3, 1e-3);
    for (int k = 0; k < POLY_MAX_COEFFS; ++k) {
        p->padfPixelCoeffs[k] = oCoef(oRng);
        p->padfLineCoeffs[k] = oCoef(oRng);
    }
    return p;
}

std::vector<double> Coordinates(std::size_t n, double dfLow, double dfHigh, unsigned nSeed) {
    std::mt19937 oRng(nSeed);
    std::uniform_real_distribution<double> oDist(dfLow, dfHigh);
    std::vector<double> adf(n);
    for (double& v : adf) v = oDist(oRng);
    return adf;
}

constexpr std::size_t kPoints = 4096;

void BM_GenGeo2Img(benchmark::State& state) {
    auto p = MakeModel(static_cast<int>(state.range(0)));
    const auto adfX = Coordinates(kPoints, 0.0, 1.0, 1);
    const auto adfY = Coordinates(kPoints, 0.0, 1.0, 2);
    double dfPixel = 0.0, dfLine = 0.0;
    for (auto _ : state) {
        for (std::size_t i = 0; i < kPoints; ++i) {
            GenGeo2Img(4, p.get(), adfX[i], adfY[i], 0.0, &dfPixel, &dfLine);
            benchmark::DoNotOptimize(dfPixel);
            benchmark::DoNotOptimize(dfLine);
        }
    }
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations() * kPoints));
}
BENCHMARK(BM_GenGeo2Img)->Arg(3)->Arg(6)->Arg(10)->Arg(15)->Arg(21)->Arg(12);

void BM_POLYGeo2Img(benchmark::State& state) {
    auto p = MakeModel(static_cast<int>(state.range(0)));
    const auto adfX = Coordinates(kPoints, 0.0, 1.0, 1);
    const auto adfY = Coordinates(kPoints, 0.0, 1.0, 2);
    double dfPixel = 0.0, dfLine = 0.0;
    for (auto _ : state) {
        for (std::size_t i = 0; i < kPoints; ++i) {
            POLYGeo2Img(p.get(), adfX[i], adfY[i], &dfPixel, &dfLine);
            benchmark::DoNotOptimize(dfPixel);
            benchmark::DoNotOptimize(dfLine);
        }
    }
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations() * kPoints));
}
BENCHMARK(BM_POLYGeo2Img)->Arg(10);

}  // namespace
