// Orbit model speed on a simulated 2048 x 6000 AVHRR pass: ground to image
// with the state table (target 200 000 points per second per core), angle
// grids for the whole pass (target under 1 s), refinement with 100 control
// points (target under 0.5 s), and one propagation.
#include <benchmark/benchmark.h>

#if __has_include("avhrr_sim.h")
#include <memory>
#include <vector>

#include "avhrr_sim.h"
#include "lumo_ephemeris.h"
#include "lumo_lrs.h"

namespace {

struct Fixture {
    EphemerisSeg_t* psSeg = nullptr;
    LRSOrbitModel_t oModel;
    std::vector<ControlPoint_t> asPoints;

    Fixture() {
        lumo::sim::AvhrrPassSpec s;
        s.nLines = 6000;
        psSeg = lumo::sim::MakeAvhrrSegment(s);
        LRSInitOrbitModel(psSeg, &oModel);
        LRSSetupCoordinateMapping(&oModel);
        asPoints = lumo::sim::SampleAvhrrPoints(oModel, 10, 10, 20.0, 2000.0, 3);
    }
    ~Fixture() { LumoSatEphemerisFree(psSeg); }
};

Fixture& Shared() {
    static Fixture sFixture;
    return sFixture;
}

void BM_LRSGeodeticToImage(benchmark::State& state) {
    Fixture& f = Shared();
    std::size_t k = 0;
    double p = 0.0, l = 0.0;
    for (auto _ : state) {
        const ControlPoint_t& c = f.asPoints[k++ % f.asPoints.size()];
        benchmark::DoNotOptimize(
            LRSGeodeticToImage(&f.oModel, c.dfGroundX, c.dfGroundY, c.dfGroundZ, &p, &l));
    }
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations()));
}
BENCHMARK(BM_LRSGeodeticToImage);

void BM_LRSImageToGeodetic(benchmark::State& state) {
    Fixture& f = Shared();
    std::size_t k = 0;
    double lon = 0.0, lat = 0.0;
    for (auto _ : state) {
        const ControlPoint_t& c = f.asPoints[k++ % f.asPoints.size()];
        benchmark::DoNotOptimize(LRSImageToGeodetic(&f.oModel, c.dfImageX, c.dfImageY, &lon, &lat));
    }
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations()));
}
BENCHMARK(BM_LRSImageToGeodetic);

void BM_LRSAngleGrids2048x6000(benchmark::State& state) {
    Fixture& f = Shared();
    for (auto _ : state) LRSSetupOrbitModelForAngleGeneration(&f.oModel);
}
BENCHMARK(BM_LRSAngleGrids2048x6000)->Unit(benchmark::kMillisecond);

void BM_LRSInterpolatedAnglesPerPixel(benchmark::State& state) {
    Fixture& f = Shared();
    LRSSetupOrbitModelForAngleGeneration(&f.oModel);
    double a[5];
    std::size_t k = 0;
    for (auto _ : state) {
        ++k;
        LRSComputeInterpolatedAngles(&f.oModel, static_cast<double>(k % 2048),
                                     static_cast<double>((k / 2048) % 6000), a, a + 1, a + 2, a + 3,
                                     a + 4, 1, nullptr, nullptr);
        benchmark::DoNotOptimize(a[0]);
    }
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations()));
}
BENCHMARK(BM_LRSInterpolatedAnglesPerPixel);

void BM_LRSRefine100Gcps(benchmark::State& state) {
    Fixture& f = Shared();
    for (auto _ : state) {
        LRSOrbitModel_t oCopy(f.oModel);
        LRSRefineOrbitModel(&oCopy, f.asPoints.data(), static_cast<int>(f.asPoints.size()));
        benchmark::DoNotOptimize(oCopy.adfRollPoly[1]);
    }
}
BENCHMARK(BM_LRSRefine100Gcps)->Unit(benchmark::kMillisecond);

void BM_Brolyd(benchmark::State& state) {
    const double mean[6] = {7229.86, 0.0011, 1.7235, 4.2, 1.57, 0.2};
    double t = 0.0;
    for (auto _ : state) {
        double m[6] = {mean[0], mean[1], mean[2], mean[3], mean[4], mean[5]}, osc[6], aux[5];
        Brolyd(t += 0.1, osc, m, 2, 1, 1, aux);
        benchmark::DoNotOptimize(osc[0]);
    }
}
BENCHMARK(BM_Brolyd);

}  // namespace
#endif
