// Side by side with the GDAL transformers that users compare us with: thin
// plate spline, GCP polynomial and RPC. Every iteration runs the peer and
// lumo on the same inputs, one after the other, so that load on the machine
// hits both alike; the counters give each side's processor time and the
// ratio peer / lumo (above 1: lumo is faster), with the accuracy each reached.
#include <benchmark/benchmark.h>
#include <gdal.h>
#include <gdal_alg.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <ctime>
#include <fstream>
#include <iterator>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "lumo.h"
#include "regression.h"

namespace {

// Processor time of the whole process (every thread): on a loaded machine
// the wall clock mostly measures the wait for a processor.
double ProcessSeconds() {
    timespec t{};
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &t);
    return static_cast<double>(t.tv_sec) + 1e-9 * static_cast<double>(t.tv_nsec);
}

template <typename Work>
double Seconds(Work&& work) {
    const double start = ProcessSeconds();
    work();
    return ProcessSeconds() - start;
}

// Accumulated time of both sides over the benchmark's iterations.
struct SideBySide {
    double peer = 0.0;
    double lumo = 0.0;

    void Report(benchmark::State& state, double items) const {
        const double runs = static_cast<double>(state.iterations());
        state.counters["peer_us"] = 1e6 * peer / runs / items;
        state.counters["lumo_us"] = 1e6 * lumo / runs / items;
        state.counters["ratio"] = lumo > 0.0 ? peer / lumo : 0.0;
    }
};

// Control points: a jittered grid over a 6000 x 5000 image mapped to a 30 km
// square of map coordinates with smooth distortion.
struct ControlPoints {
    std::vector<double> pixel, line, x, y;
    std::vector<GDAL_GCP> gcps;
};

ControlPoints Spread(int n) {
    std::mt19937 rng(17);
    std::uniform_real_distribution<double> jitter(-0.35, 0.35);
    const int side = static_cast<int>(std::ceil(std::sqrt(n)));
    ControlPoints p;
    for (int k = 0; k < n; ++k) {
        const int column = k % side;
        const int row = k / side;
        const double u = (column + 0.5 + jitter(rng)) / side;
        const double v = (row + 0.5 + jitter(rng)) / side;
        p.pixel.push_back(6000.0 * u + 40.0 * std::sin(5.0 * v) + 12.0 * u * v);
        p.line.push_back(5000.0 * (1.0 - v) + 25.0 * std::cos(4.0 * u));
        p.x.push_back(350000.0 + 30000.0 * u);
        p.y.push_back(4100000.0 + 30000.0 * v);
    }
    static char empty[] = "";
    for (int k = 0; k < n; ++k)
        p.gcps.push_back({empty, empty, p.pixel[k], p.line[k], p.x[k], p.y[k], 0.0});
    return p;
}

double Extent(const std::vector<double>& v) {
    const auto [lo, hi] = std::minmax_element(v.begin(), v.end());
    return *hi - *lo;
}

// Worst misfit of a transform over the control points in both directions,
// relative to the extent of the outputs. transform(toImage, in1, in2, out1, out2).
template <typename Transform>
double WorstMisfit(const ControlPoints& p, Transform&& transform) {
    const double pixelExtent = Extent(p.pixel), lineExtent = Extent(p.line);
    const double xExtent = Extent(p.x), yExtent = Extent(p.y);
    double worst = 0.0;
    for (std::size_t k = 0; k < p.x.size(); ++k) {
        double a = 0.0, b = 0.0;
        transform(false, p.pixel[k], p.line[k], &a, &b);
        worst = std::max({worst, std::abs(a - p.x[k]) / xExtent, std::abs(b - p.y[k]) / yExtent});
        transform(true, p.x[k], p.y[k], &a, &b);
        worst = std::max(
            {worst, std::abs(a - p.pixel[k]) / pixelExtent, std::abs(b - p.line[k]) / lineExtent});
    }
    return worst;
}

// One call of a GDAL transformer on a single point.
int PeerPoint(GDALTransformerFunc fn, void* arg, bool dstToSrc, double in1, double in2,
              double* out1, double* out2, double z = 0.0) {
    int ok = 0;
    *out1 = in1;
    *out2 = in2;
    fn(arg, dstToSrc ? TRUE : FALSE, 1, out1, out2, &z, &ok);
    return ok;
}

struct TpsPair {
    TPSInfo_t toImage{0};
    TPSInfo_t toGround{0};
    void Fit(ControlPoints& p) {
        const int n = static_cast<int>(p.x.size());
        TPSCalculate(&toGround, n, p.pixel.data(), p.line.data(), p.x.data(), p.y.data());
        TPSCalculate(&toImage, n, p.x.data(), p.y.data(), p.pixel.data(), p.line.data());
    }
};

// Both directions, as the peer's constructor fits them.
void BM_PeerTpsFit(benchmark::State& state) {
    const int n = static_cast<int>(state.range(0));
    ControlPoints p = Spread(n);
    SideBySide t;
    void* peer = nullptr;
    TpsPair ours;
    for (auto _ : state) {
        if (peer != nullptr) GDALDestroyTPSTransformer(peer);
        t.peer += Seconds([&] { peer = GDALCreateTPSTransformer(n, p.gcps.data(), FALSE); });
        t.lumo += Seconds([&] { ours.Fit(p); });
    }
    t.Report(state, 1.0);
    state.counters["peer_misfit"] =
        WorstMisfit(p, [&](bool toImage, double a, double b, double* c, double* d) {
            PeerPoint(GDALTPSTransform, peer, toImage, a, b, c, d);
        });
    state.counters["lumo_misfit"] =
        WorstMisfit(p, [&](bool toImage, double a, double b, double* c, double* d) {
            TPSTransform(toImage ? &ours.toImage : &ours.toGround, a, b, c, d);
        });
    GDALDestroyTPSTransformer(peer);
}
BENCHMARK(BM_PeerTpsFit)->Arg(1000)->Iterations(3)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_PeerTpsFit)->Arg(3000)->Iterations(1)->UseRealTime()->Unit(benchmark::kMillisecond);

// Evaluation points spread over the image.
std::vector<double> Uniform(std::size_t count, double lo, double hi, unsigned seed) {
    std::mt19937 rng(seed);
    std::uniform_real_distribution<double> dist(lo, hi);
    std::vector<double> v(count);
    for (double& value : v) value = dist(rng);
    return v;
}

constexpr std::size_t kPoints = 4096;

void BM_PeerTpsTransform(benchmark::State& state) {
    const int n = static_cast<int>(state.range(0));
    ControlPoints p = Spread(n);
    void* peer = GDALCreateTPSTransformer(n, p.gcps.data(), FALSE);
    TpsPair ours;
    ours.Fit(p);
    const std::vector<double> pixel = Uniform(kPoints, 0.0, 6000.0, 1);
    const std::vector<double> line = Uniform(kPoints, 0.0, 5000.0, 2);
    std::vector<double> a(kPoints), b(kPoints), z(kPoints);
    std::vector<int> ok(kPoints);
    SideBySide t;
    for (auto _ : state) {
        a = pixel;
        b = line;
        t.peer += Seconds([&] {
            GDALTPSTransform(peer, FALSE, static_cast<int>(kPoints), a.data(), b.data(), z.data(),
                             ok.data());
        });
        t.lumo += Seconds([&] {
            for (std::size_t k = 0; k < kPoints; ++k)
                TPSTransform(&ours.toGround, pixel[k], line[k], &a[k], &b[k]);
        });
        benchmark::DoNotOptimize(a.data());
    }
    t.Report(state, kPoints);
    GDALDestroyTPSTransformer(peer);
}
BENCHMARK(BM_PeerTpsTransform)->Arg(1000)->UseRealTime();

// Third-order polynomials in both directions: fitting and evaluation.
void BM_PeerGcpPolynomial(benchmark::State& state) {
    const int n = static_cast<int>(state.range(0));
    constexpr int kOrder = 3;
    ControlPoints p = Spread(n);
    GEOInfo_t toGround{}, toImage{};
    const std::vector<double> pixel = Uniform(kPoints, 0.0, 6000.0, 3);
    const std::vector<double> line = Uniform(kPoints, 0.0, 5000.0, 4);
    std::vector<double> a(kPoints), b(kPoints), z(kPoints);
    std::vector<int> ok(kPoints);
    SideBySide fit, evaluate;
    void* peer = nullptr;
    for (auto _ : state) {
        if (peer != nullptr) GDALDestroyGCPTransformer(peer);
        fit.peer +=
            Seconds([&] { peer = GDALCreateGCPTransformer(n, p.gcps.data(), kOrder, FALSE); });
        fit.lumo += Seconds([&] {
            int order = kOrder;
            GCPRegression2(&toGround, "PIXEL", p.pixel.data(), p.line.data(), "METRE", p.x.data(),
                           p.y.data(), n, &order, 0, nullptr, nullptr);
            order = kOrder;
            GCPRegression2(&toImage, "METRE", p.x.data(), p.y.data(), "PIXEL", p.pixel.data(),
                           p.line.data(), n, &order, 0, nullptr, nullptr);
        });
        a = pixel;
        b = line;
        evaluate.peer += Seconds([&] {
            GDALGCPTransform(peer, FALSE, static_cast<int>(kPoints), a.data(), b.data(), z.data(),
                             ok.data());
        });
        evaluate.lumo += Seconds([&] {
            for (std::size_t k = 0; k < kPoints; ++k)
                GCPTransform(&toGround, pixel[k], line[k], &a[k], &b[k]);
        });
        benchmark::DoNotOptimize(a.data());
    }
    const double runs = static_cast<double>(state.iterations());
    state.counters["fit_peer_ms"] = 1e3 * fit.peer / runs;
    state.counters["fit_lumo_ms"] = 1e3 * fit.lumo / runs;
    state.counters["fit_ratio"] = fit.peer / fit.lumo;
    evaluate.Report(state, kPoints);
    state.counters["peer_ok"] = static_cast<double>(std::count(ok.begin(), ok.end(), TRUE));
    state.counters["peer_created"] = peer != nullptr;
    GDALDestroyGCPTransformer(peer);
}
BENCHMARK(BM_PeerGcpPolynomial)->Arg(1000)->UseRealTime();

// ---------------------------------------------------------------------------
// Rational functions: the bundled example scene's RPC model on both sides.
// ---------------------------------------------------------------------------

struct RfDeleter {
    void operator()(RFInfo_t* p) const { RFDeallocate(p); }
};
using RfPtr = std::unique_ptr<RFInfo_t, RfDeleter>;

RfPtr ExampleModel() {
    const std::string path = std::string(LUMO_EXAMPLES_DIR) + "/rf_scene_RPC.TXT";
    std::ifstream in(path, std::ios::binary);
    const std::string text((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    return RfPtr(LumoRPCTextToRFInfo(text.data(), text.size(), LUMO_RPC_TEXT_AUTO, path.c_str()));
}

GDALRPCInfoV2 PeerModel(const RFInfo_t& rf) {
    GDALRPCInfoV2 r{};
    r.dfLINE_OFF = rf.dfLineOffset;
    r.dfSAMP_OFF = rf.dfPixelOffset;
    r.dfLAT_OFF = rf.dfYOffset;
    r.dfLONG_OFF = rf.dfXOffset;
    r.dfHEIGHT_OFF = rf.dfZOffset;
    r.dfLINE_SCALE = rf.dfLineScale;
    r.dfSAMP_SCALE = rf.dfPixelScale;
    r.dfLAT_SCALE = rf.dfYScale;
    r.dfLONG_SCALE = rf.dfXScale;
    r.dfHEIGHT_SCALE = rf.dfZScale;
    // The term order of both is the RPC00B order.
    std::copy_n(rf.padfLineNum, 20, r.adfLINE_NUM_COEFF);
    std::copy_n(rf.padfLineDen, 20, r.adfLINE_DEN_COEFF);
    std::copy_n(rf.padfPixelNum, 20, r.adfSAMP_NUM_COEFF);
    std::copy_n(rf.padfPixelDen, 20, r.adfSAMP_DEN_COEFF);
    r.dfMIN_LONG = rf.dfXOffset - rf.dfXScale;
    r.dfMAX_LONG = rf.dfXOffset + rf.dfXScale;
    r.dfMIN_LAT = rf.dfYOffset - rf.dfYScale;
    r.dfMAX_LAT = rf.dfYOffset + rf.dfYScale;
    return r;
}

constexpr double kInverseTolerance = 1e-8;  // pixels

struct RfSetUp {
    RfPtr ours = ExampleModel();
    GDALRPCInfoV2 info = PeerModel(*ours);
    void* peer = GDALCreateRPCTransformerV2(&info, FALSE, kInverseTolerance, nullptr);
    std::vector<double> lon, lat, height;
    double shift = 0.0;  // our pixel minus the peer's (0 or 0.5): the two pixel conventions

    RfSetUp() {
        const RFInfo_t& rf = *ours;
        lon =
            Uniform(kPoints, rf.dfXOffset - 0.9 * rf.dfXScale, rf.dfXOffset + 0.9 * rf.dfXScale, 5);
        lat =
            Uniform(kPoints, rf.dfYOffset - 0.9 * rf.dfYScale, rf.dfYOffset + 0.9 * rf.dfYScale, 6);
        height =
            Uniform(kPoints, rf.dfZOffset - 0.5 * rf.dfZScale, rf.dfZOffset + 0.5 * rf.dfZScale, 7);
        double pixel = 0.0, line = 0.0, peerPixel = 0.0, peerLine = 0.0;
        RFGeo2Img(ours.get(), lon[0], lat[0], height[0], &pixel, &line);
        PeerPoint(GDALRPCTransform, peer, true, lon[0], lat[0], &peerPixel, &peerLine, height[0]);
        shift = std::round(2.0 * (pixel - peerPixel)) / 2.0;
    }
    ~RfSetUp() { GDALDestroyRPCTransformer(peer); }
    RfSetUp(const RfSetUp&) = delete;
    RfSetUp& operator=(const RfSetUp&) = delete;
};

// Argument: 0 point by point, 1 through the batch entry point.
void BM_PeerRfForward(benchmark::State& state) {
    RfSetUp s;
    const bool batch = state.range(0) != 0;
    std::vector<double> a(kPoints), b(kPoints), z(kPoints), pixel(kPoints), line(kPoints);
    std::vector<int> ok(kPoints);
    SideBySide t;
    for (auto _ : state) {
        a = s.lon;
        b = s.lat;
        z = s.height;
        t.peer += Seconds([&] {
            GDALRPCTransform(s.peer, TRUE, static_cast<int>(kPoints), a.data(), b.data(), z.data(),
                             ok.data());
        });
        t.lumo += Seconds([&] {
            if (batch) {
                RFGeo2ImgBatch(s.ours.get(), static_cast<int>(kPoints), s.lon.data(), s.lat.data(),
                               s.height.data(), pixel.data(), line.data(), nullptr);
                return;
            }
            for (std::size_t k = 0; k < kPoints; ++k)
                RFGeo2Img(s.ours.get(), s.lon[k], s.lat[k], s.height[k], &pixel[k], &line[k]);
        });
    }
    t.Report(state, kPoints);
    double worst = 0.0;  // agreement of the two sides after the convention shift
    for (std::size_t k = 0; k < kPoints; ++k)
        worst = std::max(
            {worst, std::abs(pixel[k] - s.shift - a[k]), std::abs(line[k] - s.shift - b[k])});
    state.counters["max_diff_px"] = worst;
    state.counters["convention_shift_px"] = s.shift;
}
BENCHMARK(BM_PeerRfForward)->ArgName("batch")->Arg(0)->Arg(1)->UseRealTime();

// Image to ground at known heights, both sides to kInverseTolerance pixels;
// the accuracy counters project each answer forward with our model.
// Argument: 0 point by point, 1 through the batch entry point.
void BM_PeerRfInverse(benchmark::State& state) {
    RfSetUp s;
    const bool batch = state.range(0) != 0;
    std::vector<double> pixel(kPoints), line(kPoints);
    for (std::size_t k = 0; k < kPoints; ++k)
        RFGeo2Img(s.ours.get(), s.lon[k], s.lat[k], s.height[k], &pixel[k], &line[k]);
    std::vector<double> a(kPoints), b(kPoints), z(kPoints), x(kPoints), y(kPoints);
    std::vector<int> ok(kPoints);
    SideBySide t;
    for (auto _ : state) {
        for (std::size_t k = 0; k < kPoints; ++k) {
            a[k] = pixel[k] - s.shift;
            b[k] = line[k] - s.shift;
        }
        z = s.height;
        t.peer += Seconds([&] {
            GDALRPCTransform(s.peer, FALSE, static_cast<int>(kPoints), a.data(), b.data(), z.data(),
                             ok.data());
        });
        t.lumo += Seconds([&] {
            if (batch) {
                RFImg2GeoBatch(s.ours.get(), static_cast<int>(kPoints), pixel.data(), line.data(),
                               s.height.data(), x.data(), y.data(), nullptr);
                return;
            }
            for (std::size_t k = 0; k < kPoints; ++k) {
                double height = s.height[k];
                x[k] = y[k] = 0.0;
                RFImg2Geo(s.ours.get(), pixel[k], line[k], &x[k], &y[k], &height);
            }
        });
    }
    t.Report(state, kPoints);
    auto worstError = [&](const std::vector<double>& gx, const std::vector<double>& gy) {
        double worst = 0.0;
        for (std::size_t k = 0; k < kPoints; ++k) {
            double p = 0.0, l = 0.0;
            RFGeo2Img(s.ours.get(), gx[k], gy[k], s.height[k], &p, &l);
            worst = std::max({worst, std::abs(p - pixel[k]), std::abs(l - line[k])});
        }
        return worst;
    };
    state.counters["peer_err_px"] = worstError(a, b);
    state.counters["lumo_err_px"] = worstError(x, y);
}
BENCHMARK(BM_PeerRfInverse)->ArgName("batch")->Arg(0)->Arg(1)->UseRealTime();

}  // namespace
