// Aerial photo model throughput, ground to image and image to ground, with
// every correction on: a tilted 1:10 000 frame photo in millimetres on a
// 25 um scan, points spread over the whole photo at varied heights.
#include <benchmark/benchmark.h>

#include <cmath>
#include <memory>
#include <random>
#include <vector>

#include "lumo.h"
#include "support/model_records.h"

namespace {

using lumo::support::ApPtr;

constexpr int kPoints = 4096;

ApPtr FramePhoto() {
    ApPtr ap(APAllocate());
    // omega 0.4 deg, phi -0.7 deg, kappa 1.9 deg
    const double R[9] = {0.99939199761134556,   0.032365470765528086,   0.012965778516156804,
                         -0.032454788105201943, 0.99945048866845776,    0.0067385035005881281,
                         -0.012740558835888214, -0.0071552080687246637, 0.99989323487962589};
    for (int i = 0; i < 9; ++i) ap->adfRotation[i] = R[i];
    const double d[8] = {4600.0, 40.0, 0.0363, 0.0, 4600.0, 0.0363, -40.0, 0.0};
    const double det = d[1] * d[6] - d[2] * d[5];
    const double a = d[6] / det, b = -d[2] / det, c = -d[5] / det, e = d[1] / det;
    const double inv[8] = {-(a * d[0] + b * d[4]), a, b, 0.0, -(c * d[0] + e * d[4]), c, e, 0.0};
    lumo::support::SetFiducials(*ap, d, inv);
    // f, camera X/Y/Z, principal point, k3, k5, p1, p2, Earth radius; every
    // correction on.
    lumo::support::SetFrameCamera(*ap, {153.0, 500000.0, 4000000.0, 1650.0, 0.012, -0.008, 5.2e-9,
                                        -1.55e-13, 4.8e-8, -3.1e-8, 6371000.0, 31u});
    return ap;
}

struct Points {
    std::vector<double> x, y, z;
};

Points GroundPoints() {
    std::mt19937 rng(5);
    std::uniform_real_distribution<double> u(-1100.0, 1100.0), h(50.0, 400.0);
    Points p;
    for (int i = 0; i < kPoints; ++i) {
        p.x.push_back(500000.0 + u(rng));
        p.y.push_back(4000000.0 + u(rng));
        p.z.push_back(h(rng));
    }
    return p;
}

void BM_APGeo2Img(benchmark::State& state) {
    const ApPtr ap = FramePhoto();
    const Points g = GroundPoints();
    std::vector<double> pixel(kPoints), line(kPoints);
    for (auto _ : state) {
        for (int i = 0; i < kPoints; ++i) {
            APGeo2Img(ap.get(), g.x[i], g.y[i], g.z[i], &pixel[i], &line[i]);
        }
        benchmark::DoNotOptimize(pixel.data());
        benchmark::ClobberMemory();
    }
    state.SetItemsProcessed(state.iterations() * kPoints);
}
BENCHMARK(BM_APGeo2Img);

void BM_APImg2GeoDem(benchmark::State& state) {
    const ApPtr ap = FramePhoto();
    const Points g = GroundPoints();
    std::vector<double> pixel(kPoints), line(kPoints), x(kPoints), y(kPoints);
    for (int i = 0; i < kPoints; ++i) {
        APGeo2Img(ap.get(), g.x[i], g.y[i], g.z[i], &pixel[i], &line[i]);
    }
    for (auto _ : state) {
        for (int i = 0; i < kPoints; ++i) {
            double z = g.z[i];
            APImg2GeoDem(ap.get(), pixel[i], line[i], &z, &x[i], &y[i]);
        }
        benchmark::DoNotOptimize(x.data());
        benchmark::ClobberMemory();
    }
    state.SetItemsProcessed(state.iterations() * kPoints);
}
BENCHMARK(BM_APImg2GeoDem);

// The same through the generic dispatch, as hosts call it.
void BM_GenGeo2ImgAP(benchmark::State& state) {
    const ApPtr ap = FramePhoto();
    const Points g = GroundPoints();
    std::vector<double> pixel(kPoints), line(kPoints);
    for (auto _ : state) {
        for (int i = 0; i < kPoints; ++i) {
            GenGeo2Img(LUMO_CODE_AP, ap.get(), g.x[i], g.y[i], g.z[i], &pixel[i], &line[i]);
        }
        benchmark::DoNotOptimize(pixel.data());
        benchmark::ClobberMemory();
    }
    state.SetItemsProcessed(state.iterations() * kPoints);
}
BENCHMARK(BM_GenGeo2ImgAP);

}  // namespace
