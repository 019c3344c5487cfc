// Block adjustment speed: 100 simulated images in a 10 x 10 grid (strips
// side by side, alternating roll), four control points and 25 check
// observations per image, 2 000 tie points between neighbours, of known or
// of estimated elevation (target: the whole adjustment under 5 s). The
// worst image's check-point RMS is reported as a counter.
#include <benchmark/benchmark.h>

#if __has_include("lumo_sim.h")
#include <vector>

#include "../tools/lumo/elevation_separation.h"
#include "lumo_srit.h"
#include "support/srit_block.h"

namespace {

using lumo::support::GridBlock;

constexpr int kRows = 10, kCols = 10, kTiePoints = 2000;

// The images lumo block holds near their orbit values by itself: those
// whose control points cannot separate the elevation terms.
std::vector<char> WeakImages() {
    const GridBlock sGrid(kRows, kCols, 0, false);
    std::vector<char> abWeak;
    for (std::size_t k = 0; k < sGrid.aasControl.size(); ++k) {
        std::vector<lumo::cli::ControlSample> asSamples;
        for (const lumo::sim::SimPoint& s : sGrid.aasControl[k]) {
            asSamples.push_back({s.dfPixel, s.dfLine, s.dfZ});
        }
        const double dfWeakest =
            lumo::cli::SeparationOf(*sGrid.sBlock.apsSegments[k], asSamples).Weakest();
        abWeak.push_back(dfWeakest < lumo::cli::kWeakSeparation ? 1 : 0);
    }
    return abWeak;
}

void BM_SRITBlock100Images(benchmark::State& state) {
    std::vector<char> abConstrained;
    if (state.range(0) == 2) abConstrained.assign(kRows * kCols, 1);
    if (state.range(0) == 3) abConstrained = WeakImages();
    GridBlock sGrid(kRows, kCols, kTiePoints, state.range(0) == 1, abConstrained);
    if (state.range(0) == 3) {
        for (SRITInfo_t* psModel : sGrid.sBlock.apsModels) {
            psModel->anAux[SRIT_AUX_FORM] = SRIT_FORM_CURVED_INCIDENCE;
        }
    }
    for (auto _ : state) {
        const int nResult = sGrid.sBlock.Run();
        if (nResult != 1) state.SkipWithError("the block adjustment failed");
        benchmark::DoNotOptimize(nResult);
    }
    state.counters["images"] = static_cast<double>(sGrid.sBlock.asScenes.size());
    state.counters["tie_points"] = sGrid.nTies;
    int nConstrained = 0;
    for (char b : abConstrained) nConstrained += b;
    state.counters["constrained_images"] = nConstrained;
    // Check-point accuracy of the last run, worst image, in pixels.
    state.counters["worst_check_rms_px"] = sGrid.WorstCheckRms();
}
// Argument 1: tie points of known elevation; 0: elevations estimated; 2:
// elevations estimated, every segment asking for the parameter constraints
// (lumo block --constrain); 3: elevations estimated, the images whose
// control points cannot separate the elevation terms constrained (what
// lumo block does without options).
BENCHMARK(BM_SRITBlock100Images)
    ->Arg(1)
    ->Arg(0)
    ->Arg(2)
    ->Arg(3)
    ->Unit(benchmark::kMillisecond)
    ->Iterations(2);

}  // namespace
#endif
