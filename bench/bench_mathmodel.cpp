// Point transforms through the math model object against the family
// functions they wrap: the object's cost is the difference per point.
#include <benchmark/benchmark.h>

#include <cmath>
#include <cstdint>
#include <cstring>
#include <ctime>
#include <memory>
#include <random>
#include <vector>

#include "lumo.h"
#include "nova/parallel.h"
#include "nova/projection.h"
#include "support/model_records.h"

namespace {

constexpr std::size_t kPoints = 4096;
constexpr const char* kGeosys = "UTM 31 U D000";

using lumo::support::PolyPtr;
using lumo::support::TpsPtr;

struct Points {
    std::vector<double> x, y;
};

Points GroundPoints(std::size_t n, unsigned seed) {
    std::mt19937 rng(seed);
    std::uniform_real_distribution<double> east(440000.0, 500000.0), north(5660000.0, 5720000.0);
    Points p;
    for (std::size_t i = 0; i < n; ++i) {
        p.x.push_back(east(rng));
        p.y.push_back(north(rng));
    }
    return p;
}

// A third-order polynomial over a UTM 31 scene (the bundled example's size).
PolyPtr MakePoly() {
    PolyPtr p(POLYAllocate());
    p->nCoeffs = 10;
    p->nPixels = p->nLines = 6000;
    const double pixel[10] = {-44000.0, 0.1, 1e-3, 1e-12, 1e-12, 1e-12, 0, 0, 0, 0};
    const double line[10] = {572000.0, 1e-3, -0.1, 1e-12, 1e-12, 1e-12, 0, 0, 0, 0};
    std::memcpy(p->padfPixelCoeffs, pixel, sizeof pixel);
    std::memcpy(p->padfLineCoeffs, line, sizeof line);
    std::strcpy(p->pszGeosys, kGeosys);
    Geosys2ProjInfo(p->psProjInfo, kGeosys, 0.0, 0.0, 1.0, 1.0);
    return p;
}

// A spline through `n` control points spread over the same scene.
TpsPtr MakeTps(int n) {
    TpsPtr t(TPSAllocate(nullptr));
    Points g = GroundPoints(static_cast<std::size_t>(n), 11);
    std::vector<double> pixel, line;
    for (int i = 0; i < n; ++i) {
        pixel.push_back((g.x[i] - 440000.0) / 10.0 + 0.3 * std::sin(g.y[i] * 1e-3));
        line.push_back((5720000.0 - g.y[i]) / 10.0 + 0.3 * std::cos(g.x[i] * 1e-3));
    }
    TRNCalculate(t->psGeoToImage, n, g.x.data(), g.y.data(), pixel.data(), line.data(), nullptr);
    TRNCalculate(t->psImageToGeo, n, pixel.data(), line.data(), g.x.data(), g.y.data(), nullptr);
    t->nPixels = t->nLines = 6000;
    std::strcpy(t->pszGeosys, kGeosys);
    Geosys2ProjInfo(t->psProjInfo, kGeosys, 0.0, 0.0, 1.0, 1.0);
    return t;
}

// Times fnToImage(x, y, pixel, line) on one ground point per iteration,
// cycling through the points.
template <typename F>
void TimeGroundToImage(benchmark::State& state, const Points& g, F fnToImage) {
    std::size_t i = 0;
    for (auto _ : state) {
        double pixel, line;
        fnToImage(g.x[i], g.y[i], pixel, line);
        benchmark::DoNotOptimize(pixel);
        benchmark::DoNotOptimize(line);
        i = (i + 1) % kPoints;
    }
}

// The same through the host interface, as host code sees the object.
void TimeObjectGroundToImage(benchmark::State& state, const nova::mathmodel::IMathModel& model,
                             const Points& g) {
    TimeGroundToImage(state, g, [&model](double x, double y, double& pixel, double& line) {
        benchmark::DoNotOptimize(model.GroundToImage(x, y, 0.0, pixel, line, false));
    });
}

void BM_PolyFamily(benchmark::State& state) {
    auto poly = MakePoly();
    TimeGroundToImage(state, GroundPoints(kPoints, 1),
                      [&poly](double x, double y, double& pixel, double& line) {
                          POLYGeo2Img(poly.get(), x, y, &pixel, &line);
                      });
}
BENCHMARK(BM_PolyFamily);

void BM_PolyObject(benchmark::State& state) {
    auto poly = MakePoly();
    const std::unique_ptr<nova::mathmodel::IMathModel> model(
        new nova::mathmodel::LumoMathModel(LUMO_CODE_POLY, poly.get()));
    TimeObjectGroundToImage(state, *model, GroundPoints(kPoints, 1));
}
BENCHMARK(BM_PolyObject);

void BM_TpsFamily(benchmark::State& state) {
    auto tps = MakeTps(static_cast<int>(state.range(0)));
    TimeGroundToImage(state, GroundPoints(kPoints, 2),
                      [&tps](double x, double y, double& pixel, double& line) {
                          TPSGeo2Img(tps.get(), x, y, &pixel, &line);
                      });
}
BENCHMARK(BM_TpsFamily)->Arg(15)->Arg(100);

void BM_TpsObject(benchmark::State& state) {
    auto tps = MakeTps(static_cast<int>(state.range(0)));
    const std::unique_ptr<nova::mathmodel::IMathModel> model(
        new nova::mathmodel::LumoMathModel(LUMO_CODE_TPS, tps.get()));
    TimeObjectGroundToImage(state, *model, GroundPoints(kPoints, 2));
}
BENCHMARK(BM_TpsObject)->Arg(15)->Arg(100);

void BM_PolyObjectImageToGround(benchmark::State& state) {
    auto poly = MakePoly();
    poly->padfXCoeffs[1] = 10.0;
    poly->padfYCoeffs[2] = -10.0;
    const std::unique_ptr<nova::mathmodel::IMathModel> model(
        new nova::mathmodel::LumoMathModel(LUMO_CODE_POLY, poly.get()));
    std::size_t i = 0;
    for (auto _ : state) {
        double x, y;
        benchmark::DoNotOptimize(
            model->ImageToGround(static_cast<double>(i), 3000.0, 0.0, x, y, false));
        benchmark::DoNotOptimize(x);
        benchmark::DoNotOptimize(y);
        i = (i + 1) % kPoints;
    }
}
BENCHMARK(BM_PolyObjectImageToGround);

double ProcessSeconds() {
    timespec t{};
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &t);
    return static_cast<double>(t.tv_sec) + 1e-9 * static_cast<double>(t.tv_nsec);
}

// One million points through the object's array form (one call) and its
// block form (1000 x 1000, every point exact), on 1 or 2 threads: the wall
// clock shows what splitting across cores gains.
void BM_TpsObjectMillionPoints(benchmark::State& state) {
    auto tps = MakeTps(100);
    const nova::mathmodel::LumoMathModel model(LUMO_CODE_TPS, tps.get());
    constexpr int kSide = 1000;
    constexpr std::size_t kMillion = static_cast<std::size_t>(kSide) * kSide;
    std::vector<double> x(kMillion), pixel(kMillion), line(kMillion);
    for (std::size_t i = 0; i < kMillion; ++i) x[i] = 440000.0 + 0.06 * static_cast<double>(i);
    std::vector<float> pixelF(kMillion), lineF(kMillion);
    nova::SetEvaluationThreads(static_cast<int>(state.range(0)));
    const bool block = state.range(1) != 0;
    // Processor time of every thread: against the calling thread's own time
    // (the framework's CPU column) it shows how evenly the work was split,
    // which is what the wall clock gains when the cores are free.
    const double startCpu = ProcessSeconds();
    for (auto _ : state) {
        const int result =
            block ? model.GroundToImage(kSide, kSide, 1, nullptr, nullptr, nullptr, pixelF.data(),
                                        lineF.data(), nullptr, 440000.0, 5720000.0, 60.0, -60.0,
                                        0.0, false)
                  : model.GroundToImage(5690000.0, 0.0, static_cast<int>(kMillion), x.data(),
                                        pixel.data(), line.data(), nullptr, false);
        benchmark::DoNotOptimize(result);
    }
    state.counters["process_cpu_ms"] =
        1e3 * (ProcessSeconds() - startCpu) / static_cast<double>(state.iterations());
    nova::SetEvaluationThreads(0);
    state.SetItemsProcessed(state.iterations() * static_cast<std::int64_t>(kMillion));
}
BENCHMARK(BM_TpsObjectMillionPoints)
    ->ArgsProduct({{1, 2}, {0, 1}})
    ->ArgNames({"threads", "block"})
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

}  // namespace
