// Per-point cost of GCTPTransform against calling PROJ directly on the same
// points (UTM zone 31 north <-> WGS 84 longitude/latitude).

#include <benchmark/benchmark.h>
#include <proj.h>

#include <vector>

#include "projection.h"

namespace {

constexpr int kPoints = 1024;

struct Points {
    std::vector<double> adfLon, adfLat, adfE, adfN;
};

const Points& SamplePoints() {
    static const Points sPoints = [] {
        Points s;
        ProjInfo_t sGeo;
        ProjInfo_t sUtm;
        Geosys2ProjInfo(&sGeo, "LONG/LAT D000", 0.0, 0.0, 1.0, 1.0);
        Geosys2ProjInfo(&sUtm, "UTM 31 U D000", 0.0, 0.0, 1.0, 1.0);
        for (int i = 0; i < kPoints; ++i) {
            const double dfLon = 0.5 + 5.0 * (i % 32) / 32.0;
            const double dfLat = 40.0 + 15.0 * static_cast<double>(i / 32) / 32.0;
            double e = 0.0, n = 0.0;
            GCTPTransform(&sGeo, dfLon, dfLat, &sUtm, &e, &n);
            s.adfLon.push_back(dfLon);
            s.adfLat.push_back(dfLat);
            s.adfE.push_back(e);
            s.adfN.push_back(n);
        }
        return s;
    }();
    return sPoints;
}

void RunGctp(benchmark::State& oState, const char* pszFrom, const char* pszTo, bool bFromGeo) {
    const Points& s = SamplePoints();
    ProjInfo_t sFrom;
    ProjInfo_t sTo;
    Geosys2ProjInfo(&sFrom, pszFrom, 0.0, 0.0, 1.0, 1.0);
    Geosys2ProjInfo(&sTo, pszTo, 0.0, 0.0, 1.0, 1.0);
    for (auto _ : oState) {
        for (int i = 0; i < kPoints; ++i) {
            double x = 0.0, y = 0.0;
            if (bFromGeo) {
                GCTPTransform(&sFrom, s.adfLon[i], s.adfLat[i], &sTo, &x, &y);
            } else {
                GCTPTransform(&sFrom, s.adfE[i], s.adfN[i], &sTo, &x, &y);
            }
            benchmark::DoNotOptimize(x);
            benchmark::DoNotOptimize(y);
        }
    }
    oState.SetItemsProcessed(oState.iterations() * kPoints);
}

void RunProj(benchmark::State& oState, bool bFromGeo) {
    const Points& s = SamplePoints();
    PJ_CONTEXT* poCtx = proj_context_create();
    PJ* poRaw = proj_create_crs_to_crs(poCtx, "EPSG:4326", "EPSG:32631", nullptr);
    PJ* poOp = proj_normalize_for_visualization(poCtx, poRaw);
    const PJ_DIRECTION eDir = bFromGeo ? PJ_FWD : PJ_INV;
    for (auto _ : oState) {
        for (int i = 0; i < kPoints; ++i) {
            const PJ_COORD sIn = bFromGeo ? proj_coord(s.adfLon[i], s.adfLat[i], 0, 0)
                                          : proj_coord(s.adfE[i], s.adfN[i], 0, 0);
            const PJ_COORD sOut = proj_trans(poOp, eDir, sIn);
            benchmark::DoNotOptimize(sOut);
        }
    }
    oState.SetItemsProcessed(oState.iterations() * kPoints);
    proj_destroy(poOp);
    proj_destroy(poRaw);
    proj_context_destroy(poCtx);
}

void BM_GctpGeoToUtm(benchmark::State& s) {
    RunGctp(s, "LONG/LAT D000", "UTM 31 U D000", true);
}
void BM_ProjGeoToUtm(benchmark::State& s) {
    RunProj(s, true);
}
void BM_GctpUtmToGeo(benchmark::State& s) {
    RunGctp(s, "UTM 31 U D000", "LONG/LAT D000", false);
}
void BM_ProjUtmToGeo(benchmark::State& s) {
    RunProj(s, false);
}
// A thread that alternates between two pairs stays within the cache.
void BM_GctpAlternatingPairs(benchmark::State& oState) {
    const Points& s = SamplePoints();
    ProjInfo_t sGeo, sUtm31, sUtm32;
    Geosys2ProjInfo(&sGeo, "LONG/LAT D000", 0.0, 0.0, 1.0, 1.0);
    Geosys2ProjInfo(&sUtm31, "UTM 31 U D000", 0.0, 0.0, 1.0, 1.0);
    Geosys2ProjInfo(&sUtm32, "UTM 32 U D000", 0.0, 0.0, 1.0, 1.0);
    for (auto _ : oState) {
        for (int i = 0; i < kPoints; ++i) {
            double x = 0.0, y = 0.0;
            GCTPTransform(&sGeo, s.adfLon[i], s.adfLat[i], i % 2 ? &sUtm31 : &sUtm32, &x, &y);
            benchmark::DoNotOptimize(x);
        }
    }
    oState.SetItemsProcessed(oState.iterations() * kPoints);
}

}  // namespace

BENCHMARK(BM_GctpGeoToUtm);
BENCHMARK(BM_ProjGeoToUtm);
BENCHMARK(BM_GctpUtmToGeo);
BENCHMARK(BM_ProjUtmToGeo);
BENCHMARK(BM_GctpAlternatingPairs);
