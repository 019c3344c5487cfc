// Radar model speed: generation of a 10 000-line scene with its 100 000-point
// rational polynomial fit (target under 2 s), and the ground-to-image
// transform through the rational polynomial model (target 10 million points
// per second per core) and through the model's own geometry.
#include <benchmark/benchmark.h>

#if __has_include("radar_sim.h")
#include <vector>

#include "lumo.h"
#include "radar_sim.h"
#include "rpc.h"
#include "support/radar_scene.h"

namespace {

struct Fixture {
    lumo::sim::RadarScene sScene;
    lumo::support::RadarSegmentPtr psSegment;
    std::vector<ControlPoint_t> aoGcps;
    std::vector<lumo::sim::SimPoint> asChecks;
    lumo::support::RadarModelPtr psModel;
    lumo::support::RadarModelPtr psOwn;  // the same without the RPC

    Fixture() : sScene(Params()), psSegment(sScene.MakeSegment()) {
        aoGcps = lumo::support::AsControlPoints(sScene.SamplePoints(12, 1, 0.0, 1500.0));
        asChecks = sScene.SamplePoints(1024, 2, 0.0, 1500.0);
        psModel.reset(Generate());
        psOwn.reset(RTCSAllocate());
        RTCSCopy(psOwn.get(), psModel.get());
        delete psOwn->poRpcModel;
        psOwn->poRpcModel = nullptr;
    }
    static lumo::sim::RadarSceneParams Params() {
        lumo::sim::RadarSceneParams p;
        p.nPixels = 8000;
        p.nLines = 10000;
        return p;
    }
    RTCSInfo_t* Generate() const {
        return RTCSGenModel(psSegment.get(), lumo::support::GeographicProjection(), "E", aoGcps);
    }
};

Fixture& Shared() {
    static Fixture sFixture;
    return sFixture;
}

void BM_RTCSGenModel10000Lines(benchmark::State& state) {
    Fixture& f = Shared();
    for (auto _ : state) {
        lumo::support::RadarModelPtr p(f.Generate());
        benchmark::DoNotOptimize(p.get());
    }
}
BENCHMARK(BM_RTCSGenModel10000Lines)->Unit(benchmark::kMillisecond)->Iterations(3);

void TimeGroundToImage(benchmark::State& state, const RTCSInfo_t* psModel) {
    Fixture& f = Shared();
    double dfSum = 0.0;
    for (auto _ : state) {
        for (const lumo::sim::SimPoint& s : f.asChecks) {
            double dfPixel = 0.0, dfLine = 0.0;
            RTCSGeo2Img(psModel, s.dfX, s.dfY, s.dfZ, &dfPixel, &dfLine);
            dfSum += dfPixel + dfLine;
        }
    }
    benchmark::DoNotOptimize(dfSum);
    state.SetItemsProcessed(state.iterations() * static_cast<int64_t>(f.asChecks.size()));
}

void BM_RTCSGeo2ImgRpc(benchmark::State& state) {
    TimeGroundToImage(state, Shared().psModel.get());
}
BENCHMARK(BM_RTCSGeo2ImgRpc);

void BM_RTCSGeo2ImgOwnGeometry(benchmark::State& state) {
    TimeGroundToImage(state, Shared().psOwn.get());
}
BENCHMARK(BM_RTCSGeo2ImgOwnGeometry);

void BM_RTCSImg2GeoRpc(benchmark::State& state) {
    Fixture& f = Shared();
    double dfSum = 0.0;
    for (auto _ : state) {
        for (const lumo::sim::SimPoint& s : f.asChecks) {
            double dfX = 0.0, dfY = 0.0;
            RTCSImg2Geo(f.psModel.get(), s.dfPixel, s.dfLine, s.dfZ, &dfX, &dfY);
            dfSum += dfX + dfY;
        }
    }
    benchmark::DoNotOptimize(dfSum);
    state.SetItemsProcessed(state.iterations() * static_cast<int64_t>(f.asChecks.size()));
}
BENCHMARK(BM_RTCSImg2GeoRpc);

}  // namespace
#endif
