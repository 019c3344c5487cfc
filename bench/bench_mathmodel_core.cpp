// Block evaluation (coarse grid plus checked interpolation) against one point
// operation per point, on a 1000 x 1000 block, for a cheap model and for an
// expensive one (about 1 microsecond per point).

#include <benchmark/benchmark.h>

#include <cmath>
#include <cstddef>
#include <string>
#include <vector>

#include "nova/mathmodel_core.h"
#include "support/model_stubs.h"

namespace nm = nova::mathmodel;

namespace {

constexpr int kSize = 1000;

// Smooth analytic image -> ground mapping; nRepeat > 1 makes each point cost
// about as much as a rigorous sensor model.
class AnalyticModel : public lumo::support::PointDrivenModel {
  public:
    explicit AnalyticModel(int nRepeat)
        : PointDrivenModel("Analytic", nm::MM_TYPE_USER, kSize, kSize, true), mnRepeat(nRepeat) {}

    using PointDrivenModel::ImageToGround;
    int ImageToGround(double u, double v, double z, double& x, double& y, bool) const override {
        double dfWobble = 0.0;
        for (int i = 0; i < mnRepeat; ++i) dfWobble += std::sin(u / (250.0 + i)) * 1e-3;
        x = 1000.0 + 2.0 * u + 0.3 * v + 4e-5 * u * v + 6.0 * std::sin(u / 250.0) + 0.004 * z +
            dfWobble;
        y = 9000.0 - 2.0 * v + 0.2 * u + 2e-5 * u * u + 4.0 * std::cos(v / 300.0) - 0.003 * z;
        return 0;
    }
    IMathModel* Clone() const override { return new AnalyticModel(*this); }

  private:
    int mnRepeat;
};

// Smooth hills without a step.
std::vector<float> Terrain() {
    return lumo::support::HillTerrain(kSize, kSize, 0.0);
}

// Arguments: repeat count of the model, then whether a terrain is given.
void BM_PerPoint(benchmark::State& state) {
    const AnalyticModel oModel(static_cast<int>(state.range(0)));
    const std::vector<float> afZ = Terrain();
    const bool bTerrain = state.range(1) != 0;
    std::vector<float> afX(afZ.size()), afY(afZ.size());
    for (auto _ : state) {
        for (int r = 0; r < kSize; ++r) {
            for (int c = 0; c < kSize; ++c) {
                const std::size_t i = static_cast<std::size_t>(r) * kSize + c;
                double dfX = 0.0;
                double dfY = 0.0;
                oModel.ImageToGround(c, r, bTerrain ? afZ[i] : 0.0, dfX, dfY, false);
                afX[i] = static_cast<float>(dfX);
                afY[i] = static_cast<float>(dfY);
            }
        }
        benchmark::DoNotOptimize(afX.data());
    }
    state.SetItemsProcessed(state.iterations() * kSize * kSize);
}

// Arguments: repeat count, terrain flag, grid step, tolerance in thousandths.
void BM_Block(benchmark::State& state) {
    const AnalyticModel oModel(static_cast<int>(state.range(0)));
    const std::vector<float> afZ = Terrain();
    const float* pafZ = state.range(1) != 0 ? afZ.data() : nullptr;
    const int nStep = static_cast<int>(state.range(2));
    const double dfTol = static_cast<double>(state.range(3)) / 1000.0;
    std::vector<float> afX(afZ.size()), afY(afZ.size());
    std::vector<unsigned char> abyValid(afZ.size());
    for (auto _ : state) {
        const int nResult =
            nm::ImageToGround(&oModel, kSize, kSize, nStep, nullptr, nullptr, pafZ, afX.data(),
                              afY.data(), abyValid.data(), 0.0, 0.0, 1.0, 1.0, dfTol, false);
        benchmark::DoNotOptimize(nResult);
    }
    state.SetItemsProcessed(state.iterations() * kSize * kSize);
}

}  // namespace

BENCHMARK(BM_PerPoint)->Args({0, 0})->Args({0, 1})->Args({100, 1})->Unit(benchmark::kMillisecond);
BENCHMARK(BM_Block)
    ->Args({0, 0, 1, 0})
    ->Args({0, 0, 32, 10})
    ->Args({0, 1, 32, 10})
    ->Args({100, 1, 1, 0})
    ->Args({100, 1, 16, 10})
    ->Args({100, 1, 32, 10})
    ->Args({100, 1, 64, 10})
    ->Args({100, 1, 32, 1})
    ->Unit(benchmark::kMillisecond);
