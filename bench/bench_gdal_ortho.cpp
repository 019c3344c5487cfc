// Orthorectification: lumo ortho against gdalwarp on the same image with
// rational polynomials, elevation file, grid, resampling and error threshold
// (run one after the other), and the peak memory of orthorectifying a
// 20000 x 20000 image. Scratch files go to the system's temporary directory.
#include <benchmark/benchmark.h>
#include <sys/resource.h>
#include <unistd.h>

#include <chrono>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include <gdal.h>
#include <ogr_srs_api.h>

#include "lumo.h"
#include "lumo_gdal.h"
#include "runtime.h"

namespace {

namespace fs = std::filesystem;

void Check(CPLErr eErr) {
    if (eErr != CE_None) throw std::runtime_error("writing a benchmark raster failed");
}

// A scene of nSize x nSize pixels of about 2 m near 7.45 E 46.95 N: Byte
// image with rational polynomials in a sidecar, elevation file under it.
struct Scene {
    fs::path oDir;
    std::string osImage;
    std::string osDem;
    int nSize = 0;

    explicit Scene(int nPixels) : nSize(nPixels) {
        lumo::gdal::Initialize();
        oDir = fs::temp_directory_path() /
               ("lumo_bench_ortho_" + std::to_string(nPixels) + "_" + std::to_string(::getpid()));
        fs::create_directories(oDir);
        osImage = (oDir / "image.tif").string();
        osDem = (oDir / "dem.tif").string();
        WriteRpc();
        WriteImage();
        WriteDem();
    }
    ~Scene() { fs::remove_all(oDir); }

    double Scale() const { return nSize / 600.0; }

    void WriteRpc() const {
        std::ifstream oIn(LUMO_SOURCE_DIR "/examples/rf_scene_RPC.TXT");
        std::stringstream oText;
        oText << "\n" << oIn.rdbuf();
        std::string osRpc = oText.str();
        const std::string asValues[][2] = {
            {"LINE_OFF", std::to_string(nSize / 2)},
            {"SAMP_OFF", std::to_string(nSize / 2)},
            {"LINE_SCALE", std::to_string(nSize / 2)},
            {"SAMP_SCALE", std::to_string(nSize / 2)},
            {"LAT_SCALE", nova::FormatString("%.6f", 0.0066 * Scale())},
            {"LONG_SCALE", nova::FormatString("%.6f", 0.008 * Scale())}};
        for (const auto& asPair : asValues) {
            osRpc = std::regex_replace(osRpc, std::regex("\n" + asPair[0] + ": [^\n]*"),
                                       "\n" + asPair[0] + ": " + asPair[1]);
        }
        std::ofstream((oDir / "image_RPC.TXT").string()) << osRpc.substr(1);
    }

    // A tiled, compressed Byte image written a strip at a time.
    void WriteImage() const {
        const char* apszOptions[] = {"TILED=YES", "COMPRESS=DEFLATE", "BIGTIFF=YES", nullptr};
        GDALDatasetH hDs = GDALCreate(GDALGetDriverByName("GTiff"), osImage.c_str(), nSize, nSize,
                                      1, GDT_Byte, const_cast<char**>(apszOptions));
        std::vector<unsigned char> abyStrip(static_cast<std::size_t>(nSize) * 256);
        for (int nRow0 = 0; nRow0 < nSize; nRow0 += 256) {
            const int nRows = std::min(256, nSize - nRow0);
            for (int r = 0; r < nRows; ++r)
                for (int c = 0; c < nSize; ++c)
                    abyStrip[static_cast<std::size_t>(r) * nSize + c] =
                        static_cast<unsigned char>(((c / 8) ^ ((nRow0 + r) / 8)) & 255);
            Check(GDALRasterIO(GDALGetRasterBand(hDs, 1), GF_Write, 0, nRow0, nSize, nRows,
                               abyStrip.data(), nSize, nRows, GDT_Byte, 0, 0));
        }
        GDALClose(hDs);
    }

    // Hills on 0.0005 degree cells over the scene and a margin.
    void WriteDem() const {
        const double dfHalfLon = 0.012 * Scale();
        const double dfHalfLat = 0.01 * Scale();
        const int nCols = static_cast<int>(2 * dfHalfLon / 0.0005);
        const int nRows = static_cast<int>(2 * dfHalfLat / 0.0005);
        GDALDatasetH hDs = GDALCreate(GDALGetDriverByName("GTiff"), osDem.c_str(), nCols, nRows, 1,
                                      GDT_Float32, nullptr);
        double adfGT[6] = {7.45 - dfHalfLon, 0.0005, 0.0, 46.95 + dfHalfLat, 0.0, -0.0005};
        GDALSetGeoTransform(hDs, adfGT);
        OGRSpatialReferenceH hSRS = OSRNewSpatialReference(nullptr);
        OSRImportFromEPSG(hSRS, 4326);
        GDALSetSpatialRef(hDs, hSRS);
        OSRDestroySpatialReference(hSRS);
        std::vector<float> afRow(nCols);
        for (int r = 0; r < nRows; ++r) {
            for (int c = 0; c < nCols; ++c)
                afRow[c] =
                    static_cast<float>(800.0 + 300.0 * std::sin(c / 20.0) * std::cos(r / 25.0));
            Check(GDALRasterIO(GDALGetRasterBand(hDs, 1), GF_Write, 0, r, nCols, 1, afRow.data(),
                               nCols, 1, GDT_Float32, 0, 0));
        }
        GDALClose(hDs);
    }
};

struct Run {
    std::unique_ptr<nova::mathmodel::IMathModel> poModel;
    nova::dem::DEMPtr poDem;
};

Run OpenScene(const Scene& oScene) {
    std::shared_ptr<void> poRecord(lumo::gdal::ReadImageRPC(oScene.osImage),
                                   [](void* p) { RFDeallocate(static_cast<RFInfo_t*>(p)); });
    ProjInfo_t sGeo{};
    Geosys2ProjInfo(&sGeo, "LONG/LAT D000", 0.0, 0.0, 1.0, 1.0);
    Run oRun;
    oRun.poModel.reset(nova::mathmodel::CreateRecordMathModel(LUMO_CODE_RF, poRecord, sGeo,
                                                              nova::ogc::cs::CS_VD_Ellipsoidal,
                                                              oScene.nSize, oScene.nSize));
    lumo::gdal::FileDEMOptions sDem;
    sDem.eHeights = lumo::gdal::HeightReference::kEllipsoid;  // as gdalwarp reads it
    oRun.poDem.reset(lumo::gdal::OpenFileDEM(oScene.osDem, sDem));
    return oRun;
}

const Scene& CompareScene() {
    static const Scene oScene(4000);
    return oScene;
}

// Both tools on one grid: lumo's default, found once.
const lumo::gdal::OrthoGrid& CompareGrid() {
    static const lumo::gdal::OrthoGrid sGrid = [] {
        const Run oRun = OpenScene(CompareScene());
        lumo::gdal::OrthoOptions sOptions;
        sOptions.osOutputCRS = "EPSG:32632";
        return lumo::gdal::PlanOrthoGrid(*oRun.poModel, CompareScene().nSize, CompareScene().nSize,
                                         *oRun.poDem, sOptions);
    }();
    return sGrid;
}

// CPU seconds used so far by this process, or by its finished children.
double CpuSeconds(int nWho) {
    rusage sUsage{};
    getrusage(nWho, &sUsage);
    return sUsage.ru_utime.tv_sec + sUsage.ru_stime.tv_sec +
           1e-6 * (sUsage.ru_utime.tv_usec + sUsage.ru_stime.tv_usec);
}

// Wall times suffer on a shared machine; CPU seconds per run are reported
// beside them.
void BM_LumoOrtho(benchmark::State& state) {
    const Scene& oScene = CompareScene();
    const Run oRun = OpenScene(oScene);
    const lumo::gdal::OrthoGrid& sGrid = CompareGrid();
    lumo::gdal::OrthoOptions sOptions;
    sOptions.osOutputCRS = "EPSG:32632";
    sOptions.nThreads = static_cast<int>(state.range(0));
    const std::string osOut = (oScene.oDir / "lumo.tif").string();
    const double dfCpu0 = CpuSeconds(RUSAGE_SELF);
    for (auto _ : state) {
        lumo::gdal::Orthorectify(oScene.osImage, *oRun.poModel, *oRun.poDem, osOut, sOptions);
    }
    state.counters["cpu_s"] = (CpuSeconds(RUSAGE_SELF) - dfCpu0) / state.iterations();
    state.counters["pixels"] = static_cast<double>(sGrid.nPixels) * sGrid.nLines;
}
BENCHMARK(BM_LumoOrtho)
    ->Arg(1)
    ->Arg(2)
    ->Unit(benchmark::kMillisecond)
    ->Iterations(3)
    ->UseRealTime();

// gdalwarp at its error threshold (pixels) given in thousandths: 125 is
// lumo's default; 10 and 0 come near lumo's measured accuracy at 125.
void BM_Gdalwarp(benchmark::State& state) {
    const Scene& oScene = CompareScene();
    const lumo::gdal::OrthoGrid& sGrid = CompareGrid();
    const double* gt = sGrid.adfGeoTransform;
    const std::string osCommand = nova::FormatString(
        "gdalwarp -q -overwrite -multi -wo NUM_THREADS=%d -wm 128 --config GDAL_CACHEMAX 256 "
        "-co TILED=YES -co COMPRESS=DEFLATE -co PREDICTOR=2 -rpc -to RPC_DEM=%s "
        "-t_srs EPSG:32632 -te %.17g %.17g %.17g %.17g -ts %d %d -r bilinear -et %g %s %s",
        static_cast<int>(state.range(0)), oScene.osDem.c_str(), gt[0], gt[3] + sGrid.nLines * gt[5],
        gt[0] + sGrid.nPixels * gt[1], gt[3], sGrid.nPixels, sGrid.nLines, state.range(1) / 1000.0,
        oScene.osImage.c_str(), (oScene.oDir / "gdalwarp.tif").c_str());
    const double dfCpu0 = CpuSeconds(RUSAGE_CHILDREN);
    for (auto _ : state) {
        if (std::system(osCommand.c_str()) != 0) state.SkipWithError("gdalwarp failed");
    }
    state.counters["cpu_s"] = (CpuSeconds(RUSAGE_CHILDREN) - dfCpu0) / state.iterations();
}
BENCHMARK(BM_Gdalwarp)
    ->ArgsProduct({{1, 2}, {125, 10, 0}})
    ->Unit(benchmark::kMillisecond)
    ->Iterations(3)
    ->UseRealTime();

// Peak resident memory of the process while orthorectifying a 20000 x 20000
// image: the warp streams, so the peak does not grow with the image.
void BM_OrthoPeakMemory(benchmark::State& state) {
    GDALSetCacheMax64(64LL << 20);  // keeps the input's writing small too
    const Scene oScene(static_cast<int>(state.range(0)));
    const Run oRun = OpenScene(oScene);
    lumo::gdal::OrthoOptions sOptions;
    const std::string osOut = (oScene.oDir / "lumo.tif").string();
    for (auto _ : state) {
        lumo::gdal::Orthorectify(oScene.osImage, *oRun.poModel, *oRun.poDem, osOut, sOptions);
    }
    rusage sUsage{};
    getrusage(RUSAGE_SELF, &sUsage);
    state.counters["peak_rss_MiB"] = static_cast<double>(sUsage.ru_maxrss) / 1024.0;
}
BENCHMARK(BM_OrthoPeakMemory)->Arg(20000)->Unit(benchmark::kSecond)->Iterations(1)->UseRealTime();

}  // namespace
