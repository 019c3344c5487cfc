// Rational function model: ground-to-image and image-to-ground throughput
// on a full 20-term model, over points spread through the normalised cube.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <memory>
#include <random>
#include <vector>

#include "lumo_rf.h"
#include "support/model_records.h"

namespace {

using lumo::support::RfPtr;

// A scene model with every term in use and first-order denominators.
RfPtr SceneModel() {
    RfPtr psRF = lumo::support::AllocateRf(RF_MAX_TERMS);
    lumo::support::SetRfSceneFrame(*psRF);
    for (int i = 0; i < RF_MAX_TERMS; ++i) {
        psRF->padfPixelNum[i] = 1e-4 / (i + 1);
        psRF->padfLineNum[i] = -1e-4 / (i + 2);
        psRF->padfPixelDen[i] = i < 4 ? 0.01 * i : 1e-6 / (i + 1);
        psRF->padfLineDen[i] = i < 4 ? -0.01 * i : 2e-6 / (i + 1);
    }
    psRF->padfPixelNum[1] = 1.2;
    psRF->padfPixelNum[2] = 0.05;
    psRF->padfLineNum[1] = 0.04;
    psRF->padfLineNum[2] = -1.21;
    psRF->padfPixelDen[0] = psRF->padfLineDen[0] = 1.0;
    return psRF;
}

struct GroundPoint {
    double x, y, z;
};

std::vector<GroundPoint> CubePoints(const RFInfo_t& rf, std::size_t count) {
    std::mt19937 rng(42);
    std::uniform_real_distribution<double> unit(-1.0, 1.0);
    std::vector<GroundPoint> points(count);
    for (GroundPoint& p : points) {
        p = {rf.dfXOffset + rf.dfXScale * unit(rng), rf.dfYOffset + rf.dfYScale * unit(rng),
             rf.dfZOffset + rf.dfZScale * unit(rng)};
    }
    return points;
}

constexpr std::size_t kPoints = 4096;

void BM_RFGeo2Img(benchmark::State& state) {
    RfPtr psRF = SceneModel();
    const std::vector<GroundPoint> points = CubePoints(*psRF, kPoints);
    for (auto _ : state) {
        for (const GroundPoint& p : points) {
            double pixel = 0.0, line = 0.0;
            RFGeo2Img(psRF.get(), p.x, p.y, p.z, &pixel, &line);
            benchmark::DoNotOptimize(pixel);
            benchmark::DoNotOptimize(line);
        }
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * kPoints));
}
BENCHMARK(BM_RFGeo2Img);

struct ImagePoint {
    double pixel, line, z;
};

void BM_RFImg2Geo(benchmark::State& state) {
    RfPtr psRF = SceneModel();
    std::vector<ImagePoint> images;
    for (const GroundPoint& p : CubePoints(*psRF, kPoints)) {
        ImagePoint i{0.0, 0.0, p.z};
        RFGeo2Img(psRF.get(), p.x, p.y, p.z, &i.pixel, &i.line);
        images.push_back(i);
    }
    for (auto _ : state) {
        for (const ImagePoint& i : images) {
            double x = LUMO_NULL_VALUE, y = LUMO_NULL_VALUE, z = i.z;
            RFImg2Geo(psRF.get(), i.pixel, i.line, &x, &y, &z);
            benchmark::DoNotOptimize(x);
            benchmark::DoNotOptimize(y);
        }
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * kPoints));
}
BENCHMARK(BM_RFImg2Geo);

// Largest ground error of ground -> image -> ground over the cube, reported
// as a counter (degrees).
void BM_RFRoundTripError(benchmark::State& state) {
    RfPtr psRF = SceneModel();
    const std::vector<GroundPoint> points = CubePoints(*psRF, kPoints);
    double worst = 0.0;
    for (auto _ : state) {
        worst = 0.0;
        for (const GroundPoint& p : points) {
            double pixel = 0.0, line = 0.0;
            RFGeo2Img(psRF.get(), p.x, p.y, p.z, &pixel, &line);
            double x = LUMO_NULL_VALUE, y = LUMO_NULL_VALUE, z = p.z;
            RFImg2Geo(psRF.get(), pixel, line, &x, &y, &z);
            worst = std::max({worst, std::fabs(x - p.x), std::fabs(y - p.y)});
        }
    }
    state.counters["max_error_deg"] = worst;
}
BENCHMARK(BM_RFRoundTripError);

}  // namespace
