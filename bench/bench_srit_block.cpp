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

namespace {

using lumo::sim::SimPoint;

constexpr int kRows = 10, kCols = 10, kTiePoints = 2000;

std::string Id(const std::string& osText) {
    std::string os = osText;
    os.resize(SRIT_ID_SIZE, ' ');
    return os;
}

struct BlockFixture {
    std::vector<lumo::sim::Scene> asScenes;
    std::string osImageIds, osGcpImage, osGcpPoint, osGcpUsage, osTieImage, osTiePoint;
    std::vector<double> p, l, x, y, z, tp, tl, tz, tzIn, tx, ty;
    std::vector<SRITInfo_t*> apsModels;
    std::vector<EphemerisSeg_t*> apsSegments;
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
                s = lumo::sim::AimAt(s, 46.0 - 0.4 * r, 1.0 + 0.55 * c, (r + c) % 2 ? 10.0 : -10.0,
                                     0.0);
                asScenes.emplace_back(s);
                osImageIds += Id("I" + std::to_string(asScenes.size()));
            }
        }
        for (std::size_t k = 0; k < asScenes.size(); ++k) {
            const std::string osImage = osImageIds.substr(k * SRIT_ID_SIZE, SRIT_ID_SIZE);
            const auto fnAdd = [&](const std::string& osId, const SimPoint& s, char cUsage) {
                osGcpImage += osImage;
                osGcpPoint += Id(osId);
                osGcpUsage += cUsage;
                p.push_back(s.dfPixel);
                l.push_back(s.dfLine);
                x.push_back(s.dfX);
                y.push_back(s.dfY);
                z.push_back(s.dfZ);
            };
            const std::uint32_t nSeed = static_cast<std::uint32_t>(k);
            const auto asGcp = asScenes[k].SamplePoints(4, 1000 + nSeed, 0.0, 1200.0, 0.05);
            for (std::size_t i = 0; i < asGcp.size(); ++i) {
                fnAdd("G" + std::to_string(k) + "_" + std::to_string(i), asGcp[i], 'A');
            }
            const auto asCheck = asScenes[k].SamplePoints(25, 2000 + nSeed, 0.0, 1200.0, 0.05);
            for (std::size_t i = 0; i < asCheck.size(); ++i) {
                fnAdd("C" + std::to_string(k) + "_" + std::to_string(i), asCheck[i], 'C');
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
        tzIn = tz;
        tx.assign(tz.size(), 0.0);
        ty.assign(tz.size(), 0.0);
        for (const auto& sScene : asScenes) {
            apsModels.push_back(SRITAllocate());
            apsSegments.push_back(sScene.MakeSegment());
        }
    }
    ~BlockFixture() {
        for (SRITInfo_t* ps : apsModels) LumoFreeSRITInfo(ps);
    }

    void AddTies(int k, int nNext, int nWanted) {
        const auto asCandidates = asScenes[static_cast<std::size_t>(k)].SamplePoints(
            600, static_cast<std::uint32_t>(3000 + k * 7 + nNext), 0.0, 1200.0, 0.02);
        int nFound = 0;
        for (const SimPoint& s : asCandidates) {
            if (nFound == nWanted) break;
            SimPoint sNext;
            if (!lumo::sim::ProjectInto(asScenes[static_cast<std::size_t>(nNext)], s, &sNext,
                                        0.02)) {
                continue;
            }
            const std::string osId = Id("T" + std::to_string(nTies++));
            for (const auto& [nImage, sObs] : {std::pair<int, SimPoint>{k, s}, {nNext, sNext}}) {
                osTieImage += osImageIds.substr(static_cast<std::size_t>(nImage) * SRIT_ID_SIZE,
                                                SRIT_ID_SIZE);
                osTiePoint += osId;
                tp.push_back(sObs.dfPixel);
                tl.push_back(sObs.dfLine);
                tz.push_back(bKnownElevation ? s.dfZ : LUMO_NULL_VALUE);
            }
            ++nFound;
        }
    }

    int Run() {
        tz = tzIn;
        const int nGcp = static_cast<int>(x.size());
        std::vector<char> achIds(static_cast<std::size_t>(nGcp) * SRIT_ID_SIZE);
        std::vector<int> anCount(static_cast<std::size_t>(nGcp));
        std::vector<double> adfOut[9];
        for (auto& adf : adfOut) adf.resize(static_cast<std::size_t>(nGcp));
        int nReported = 0;
        const int nResult = SRITCalculateN(
            static_cast<int>(asScenes.size()), osImageIds.data(), apsModels.data(), true,
            apsSegments.data(), &asScenes[0].Projection(), nGcp, osGcpImage.data(),
            osGcpPoint.data(), osGcpUsage.data(), p.data(), l.data(), z.data(), nullptr, nullptr,
            nullptr, x.data(), y.data(), nullptr, nullptr, static_cast<int>(tp.size()),
            osTieImage.data(), osTiePoint.data(), tp.data(), tl.data(), tz.data(), nullptr, nullptr,
            nullptr, tx.data(), ty.data(), &nReported, achIds.data(), anCount.data(),
            adfOut[0].data(), adfOut[1].data(), adfOut[2].data(), adfOut[3].data(),
            adfOut[4].data(), adfOut[5].data(), adfOut[6].data(), adfOut[7].data(),
            adfOut[8].data());
        // The records own their segments now; adopting them again keeps them.
        for (std::size_t k = 0; k < apsModels.size(); ++k) {
            apsSegments[k] = apsModels[k]->psEphemeris;
        }
        return nResult;
    }
};

void BM_SRITBlock100Images(benchmark::State& state) {
    BlockFixture sFixture(state.range(0) == 1, state.range(0) == 2);
    for (auto _ : state) {
        const int nResult = sFixture.Run();
        if (nResult != 1) state.SkipWithError("the block adjustment failed");
        benchmark::DoNotOptimize(nResult);
    }
    state.counters["images"] = static_cast<double>(sFixture.asScenes.size());
    state.counters["tie_points"] = sFixture.nTies;
    // Check-point accuracy of the last run, worst image, in pixels.
    double dfWorst = 0.0;
    for (std::size_t k = 0; k < sFixture.asScenes.size(); ++k) {
        const auto asCheck = sFixture.asScenes[k].SamplePoints(
            25, 2000 + static_cast<std::uint32_t>(k), 0.0, 1200.0, 0.05);
        double dfSum = 0.0;
        for (const SimPoint& s : asCheck) {
            double dfPixel = 0.0, dfLine = 0.0;
            SRITGeo2Img(sFixture.apsModels[k], s.dfX, s.dfY, s.dfZ, &dfPixel, &dfLine);
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
