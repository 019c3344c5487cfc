// Block adjustment speed: 100 simulated images in a 10 x 10 grid (strips
// side by side, alternating roll), four control points and 25 check
// observations per image, 2 000 tie points between neighbours, of known or
// of estimated elevation (target: the whole adjustment under 5 s). The
// worst image's check-point RMS is reported as a counter.
#include <benchmark/benchmark.h>

#if __has_include("lumo_sim.h")
#include <algorithm>
#include <cmath>
#include <string>
#include <utility>
#include <vector>

#include "lumo_ephemeris.h"
#include "lumo_sim.h"
#include "lumo_srit.h"
#include "support/srit_block.h"

namespace {

using lumo::sim::SimPoint;
using lumo::support::Block;

constexpr int kRows = 10, kCols = 10, kTiePoints = 2000;

struct BlockFixture {
    Block sBlock;
    int nTies = 0;
    bool bKnownElevation = true;

    BlockFixture(bool bKnown, bool bConstrained) : bKnownElevation(bKnown) {
        for (int r = 0; r < kRows; ++r) {
            for (int c = 0; c < kCols; ++c) {
                lumo::sim::SceneParams s;
                s.nUtmZone = 31;
                s.nPixels = s.nLines = 6000;
                s.dfIFOV = 10.0 / 822000.0;
                s.bConstrained = bConstrained;
                sBlock.AddImage(lumo::sim::AimAt(s, 46.0 - 0.4 * r, 1.0 + 0.55 * c,
                                                 (r + c) % 2 ? 10.0 : -10.0, 0.0));
            }
        }
        for (std::size_t k = 0; k < sBlock.asScenes.size(); ++k) {
            const auto nImage = static_cast<int>(k);
            const std::uint32_t nSeed = static_cast<std::uint32_t>(k);
            const std::string osPrefix = std::to_string(k) + "_";
            const auto asGcp = sBlock.asScenes[k].SamplePoints(4, 1000 + nSeed, 0.0, 1200.0, 0.05);
            for (std::size_t i = 0; i < asGcp.size(); ++i) {
                sBlock.AddGcp(nImage, "G" + osPrefix + std::to_string(i), asGcp[i], 'A');
            }
            const auto asCheck =
                sBlock.asScenes[k].SamplePoints(25, 2000 + nSeed, 0.0, 1200.0, 0.05);
            for (std::size_t i = 0; i < asCheck.size(); ++i) {
                sBlock.AddGcp(nImage, "C" + osPrefix + std::to_string(i), asCheck[i], 'C');
            }
        }
        // Ties with the right and the lower neighbour, spread over the pairs.
        const int nPairs = kRows * (kCols - 1) + (kRows - 1) * kCols;
        int nPair = 0;
        for (int r = 0; r < kRows; ++r) {
            for (int c = 0; c < kCols; ++c) {
                const int k = r * kCols + c;
                for (int nNext : {c + 1 < kCols ? k + 1 : -1, r + 1 < kRows ? k + kCols : -1}) {
                    if (nNext < 0) continue;
                    const int nWanted = kTiePoints / nPairs + (nPair < kTiePoints % nPairs ? 1 : 0);
                    ++nPair;
                    AddTies(k, nNext, nWanted);
                }
            }
        }
    }

    void AddTies(int k, int nNext, int nWanted) {
        const auto asCandidates = sBlock.asScenes[static_cast<std::size_t>(k)].SamplePoints(
            600, static_cast<std::uint32_t>(3000 + k * 7 + nNext), 0.0, 1200.0, 0.02);
        int nFound = 0;
        for (const SimPoint& s : asCandidates) {
            if (nFound == nWanted) break;
            SimPoint sNext;
            if (!lumo::sim::ProjectInto(sBlock.asScenes[static_cast<std::size_t>(nNext)], s, &sNext,
                                        0.02)) {
                continue;
            }
            const std::string osId = "T" + std::to_string(nTies++);
            const double dfZ = bKnownElevation ? s.dfZ : LUMO_NULL_VALUE;
            sBlock.AddTie(k, osId, s, dfZ);
            sBlock.AddTie(nNext, osId, sNext, dfZ);
            ++nFound;
        }
    }
};

void BM_SRITBlock100Images(benchmark::State& state) {
    BlockFixture sFixture(state.range(0) == 1, state.range(0) == 2);
    for (auto _ : state) {
        const int nResult = sFixture.sBlock.Run();
        if (nResult != 1) state.SkipWithError("the block adjustment failed");
        benchmark::DoNotOptimize(nResult);
    }
    state.counters["images"] = static_cast<double>(sFixture.sBlock.asScenes.size());
    state.counters["tie_points"] = sFixture.nTies;
    // Check-point accuracy of the last run, worst image, in pixels.
    double dfWorst = 0.0;
    for (std::size_t k = 0; k < sFixture.sBlock.asScenes.size(); ++k) {
        const auto asCheck = sFixture.sBlock.asScenes[k].SamplePoints(
            25, 2000 + static_cast<std::uint32_t>(k), 0.0, 1200.0, 0.05);
        double dfSum = 0.0;
        for (const SimPoint& s : asCheck) {
            double dfPixel = 0.0, dfLine = 0.0;
            SRITGeo2Img(sFixture.sBlock.apsModels[k], s.dfX, s.dfY, s.dfZ, &dfPixel, &dfLine);
            dfSum += (dfPixel - s.dfPixel) * (dfPixel - s.dfPixel) +
                     (dfLine - s.dfLine) * (dfLine - s.dfLine);
        }
        dfWorst = std::max(dfWorst, std::sqrt(dfSum / static_cast<double>(asCheck.size())));
    }
    state.counters["worst_check_rms_px"] = dfWorst;
}
// Argument 1: tie points of known elevation; 0: elevations estimated; 2:
// elevations estimated, segments asking for the parameter constraints (an
// image whose four control points lie near one plane in X, Y, Z cannot
// separate its elevation terms, and ties of unknown elevation do not help it).
BENCHMARK(BM_SRITBlock100Images)
    ->Arg(1)
    ->Arg(0)
    ->Arg(2)
    ->Unit(benchmark::kMillisecond)
    ->Iterations(2);

}  // namespace
#endif
