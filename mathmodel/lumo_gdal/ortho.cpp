// Orthorectification on GDAL's warp engine: GDAL reads, chunks, resamples
// and writes on its threads; the geometry comes from our transformer.

#include <algorithm>
#include <atomic>
#include <cmath>
#include <filesystem>
#include <string>
#include <vector>

#include <unistd.h>

#include <cpl_conv.h>
#include <cpl_string.h>
#include <gdal_utils.h>
#include <gdalwarper.h>

#include "gdal_common.h"
#include "lumo_gdal.h"
#include "ortho_grid.h"
#include "ortho_transformer.h"

namespace lumo {
namespace gdal {
namespace {

using detail::DatasetPtr;

// Memory of GDAL's warp buffers, and the most of GDAL's block cache a run
// lets itself use, so that a run's memory does not grow with the image.
constexpr double kWarpMemoryBytes = 128.0 * (1 << 20);
constexpr GIntBig kBlockCacheBytes = 256LL << 20;
// Share of the progress given to the warp when a cloud-optimised copy follows.
constexpr double kWarpShareWithCog = 0.8;

// A file that is removed when the run fails before it is kept.
class TemporaryFile {
  public:
    explicit TemporaryFile(std::string osPath) : mosPath(std::move(osPath)) {}
    ~TemporaryFile() {
        if (!mbKept) VSIUnlink(mosPath.c_str());
    }
    TemporaryFile(const TemporaryFile&) = delete;
    TemporaryFile& operator=(const TemporaryFile&) = delete;
    const std::string& Path() const { return mosPath; }
    void Keep() { mbKept = true; }

  private:
    std::string mosPath;
    bool mbKept = false;
};

// Caps GDAL's block cache for the run and restores it afterwards.
class BlockCacheLimit {
  public:
    BlockCacheLimit() : mnPrevious(GDALGetCacheMax64()) {
        if (mnPrevious > kBlockCacheBytes) GDALSetCacheMax64(kBlockCacheBytes);
    }
    ~BlockCacheLimit() { GDALSetCacheMax64(mnPrevious); }
    BlockCacheLimit(const BlockCacheLimit&) = delete;
    BlockCacheLimit& operator=(const BlockCacheLimit&) = delete;

  private:
    GIntBig mnPrevious;
};

// The user's progress callback over a part [dfStart, dfStart + dfShare].
// GDAL may report from its worker threads, so the cancellation is kept here
// rather than read back from GDAL's per-thread error state.
struct ProgressPart {
    const std::function<bool(double)>* pfnProgress;
    double dfStart;
    double dfShare;
    std::atomic<bool> bCancelled{false};
};

int CPL_STDCALL ReportProgress(double dfComplete, const char*, void* pArg) {
    auto* psPart = static_cast<ProgressPart*>(pArg);
    if (psPart->pfnProgress == nullptr || !*psPart->pfnProgress) return TRUE;
    if ((*psPart->pfnProgress)(psPart->dfStart + psPart->dfShare * dfComplete)) return TRUE;
    psPart->bCancelled = true;
    return FALSE;
}

GDALResampleAlg ToGdal(Resampling eResampling) {
    switch (eResampling) {
        case Resampling::kNearest:
            return GRA_NearestNeighbour;
        case Resampling::kCubic:
            return GRA_Cubic;
        case Resampling::kLanczos:
            return GRA_Lanczos;
        case Resampling::kBilinear:
            break;
    }
    return GRA_Bilinear;
}

void CheckOptions(const OrthoOptions& sOptions) {
    if (!(sOptions.dfErrorThreshold > 0.0) || !std::isfinite(sOptions.dfErrorThreshold)) {
        LUMO_GDAL_FAIL(nova::FormatString("invalid error threshold %g (pixels, above 0)",
                                          sOptions.dfErrorThreshold));
    }
    if (sOptions.nThreads < 0) {
        LUMO_GDAL_FAIL(nova::FormatString("invalid thread count %d", sOptions.nThreads));
    }
    if (sOptions.bHasNoData && std::isnan(sOptions.dfNoData)) {
        LUMO_GDAL_FAIL("invalid nodata value NaN");
    }
}

// What the source says about its bands.
struct SourceBands {
    int nCount = 0;
    GDALDataType eType = GDT_Byte;
    std::vector<bool> abHasNoData;
    std::vector<double> adfNoData;
    std::vector<GDALColorInterp> aeColour;
};

SourceBands ReadSourceBands(GDALDatasetH hSource) {
    SourceBands sBands;
    sBands.nCount = GDALGetRasterCount(hSource);
    for (int b = 1; b <= sBands.nCount; ++b) {
        GDALRasterBandH hBand = GDALGetRasterBand(hSource, b);
        const GDALDataType eType = GDALGetRasterDataType(hBand);
        sBands.eType = b == 1 ? eType : GDALDataTypeUnion(sBands.eType, eType);
        int bHas = FALSE;
        sBands.adfNoData.push_back(GDALGetRasterNoDataValue(hBand, &bHas));
        sBands.abHasNoData.push_back(bHas != FALSE);
        sBands.aeColour.push_back(GDALGetRasterColorInterpretation(hBand));
    }
    return sBands;
}

std::string ThreadsText(int nThreads) {
    return nThreads == 0 ? std::string("ALL_CPUS") : std::to_string(nThreads);
}

DatasetPtr CreateOutput(const std::string& osPath, const OrthoGrid& sGrid,
                        const SourceBands& sBands, double dfNoData, int nThreads) {
    GDALDriverH hDriver = GDALGetDriverByName("GTiff");
    if (hDriver == nullptr) LUMO_GDAL_FAIL("GDAL was built without its GeoTIFF driver");
    const bool bInteger = GDALDataTypeIsInteger(sBands.eType) != FALSE;
    const std::string osThreads = "NUM_THREADS=" + ThreadsText(nThreads);
    const char* apszOptions[] = {"TILED=YES",
                                 "BLOCKXSIZE=256",
                                 "BLOCKYSIZE=256",
                                 "COMPRESS=DEFLATE",
                                 bInteger ? "PREDICTOR=2" : "PREDICTOR=1",
                                 "BIGTIFF=IF_SAFER",
                                 osThreads.c_str(),
                                 nullptr};
    detail::QuietGdalErrors oQuiet;
    DatasetPtr poOut(GDALCreate(hDriver, osPath.c_str(), sGrid.nPixels, sGrid.nLines, sBands.nCount,
                                sBands.eType, const_cast<char**>(apszOptions)));
    if (!poOut) LUMO_GDAL_FAIL(osPath + ": cannot create the output file" + detail::GdalReason());
    double adfGT[6];
    std::copy(sGrid.adfGeoTransform, sGrid.adfGeoTransform + 6, adfGT);
    GDALSetGeoTransform(poOut.get(), adfGT);
    GDALSetProjection(poOut.get(), sGrid.osCRS.c_str());
    for (int b = 1; b <= sBands.nCount; ++b) {
        GDALRasterBandH hBand = GDALGetRasterBand(poOut.get(), b);
        GDALSetRasterNoDataValue(hBand, dfNoData);
        GDALSetRasterColorInterpretation(hBand, sBands.aeColour[b - 1]);
    }
    return poOut;
}

struct WarpOptionsDeleter {
    void operator()(GDALWarpOptions* psOptions) const { GDALDestroyWarpOptions(psOptions); }
};

// Warps every band of hSource into hOutput through the transformer.
void Warp(GDALDatasetH hSource, GDALDatasetH hOutput, const SourceBands& sBands, void* pTransformer,
          double dfNoData, const OrthoOptions& sOptions, ProgressPart& sPart) {
    std::unique_ptr<GDALWarpOptions, WarpOptionsDeleter> psWO(GDALCreateWarpOptions());
    psWO->hSrcDS = hSource;
    psWO->hDstDS = hOutput;
    psWO->nBandCount = sBands.nCount;
    psWO->panSrcBands = static_cast<int*>(CPLMalloc(sizeof(int) * sBands.nCount));
    psWO->panDstBands = static_cast<int*>(CPLMalloc(sizeof(int) * sBands.nCount));
    psWO->padfDstNoDataReal = static_cast<double*>(CPLMalloc(sizeof(double) * sBands.nCount));
    const bool bSourceNoData =
        std::any_of(sBands.abHasNoData.begin(), sBands.abHasNoData.end(), [](bool b) { return b; });
    if (bSourceNoData) {
        psWO->padfSrcNoDataReal = static_cast<double*>(CPLMalloc(sizeof(double) * sBands.nCount));
    }
    for (int b = 0; b < sBands.nCount; ++b) {
        psWO->panSrcBands[b] = b + 1;
        psWO->panDstBands[b] = b + 1;
        psWO->padfDstNoDataReal[b] = dfNoData;
        // A band without nodata gets a value no pixel of its type can hold.
        if (bSourceNoData) {
            psWO->padfSrcNoDataReal[b] = sBands.abHasNoData[b] ? sBands.adfNoData[b] : std::nan("");
        }
    }
    psWO->eResampleAlg = ToGdal(sOptions.eResampling);
    psWO->dfWarpMemoryLimit = kWarpMemoryBytes;
    psWO->pfnTransformer = detail::OrthoTransform;
    psWO->pTransformerArg = pTransformer;
    psWO->pfnProgress = ReportProgress;
    psWO->pProgressArg = &sPart;
    psWO->papszWarpOptions = CSLSetNameValue(psWO->papszWarpOptions, "NUM_THREADS",
                                             ThreadsText(sOptions.nThreads).c_str());
    psWO->papszWarpOptions = CSLSetNameValue(psWO->papszWarpOptions, "INIT_DEST", "NO_DATA");
    psWO->papszWarpOptions = CSLSetNameValue(psWO->papszWarpOptions, "SAMPLE_GRID", "YES");

    detail::QuietGdalErrors oQuiet;
    GDALWarpOperation oOperation;
    if (oOperation.Initialize(psWO.get()) != CE_None) {
        LUMO_GDAL_FAIL("cannot set up the warp" + detail::GdalReason());
    }
    const CPLErr eErr = oOperation.ChunkAndWarpMulti(0, 0, GDALGetRasterXSize(hOutput),
                                                     GDALGetRasterYSize(hOutput));
    if (sPart.bCancelled) LUMO_GDAL_FAIL("cancelled");
    if (eErr != CE_None) {
        LUMO_GDAL_FAIL(std::string(GDALGetDescription(hSource)) +
                       ": orthorectification failed (unreadable or truncated image?)" +
                       detail::GdalReason());
    }
}

// Closes a dataset being written; closing flushes, and only reports errors.
void CloseWritten(DatasetPtr& poDataset, const std::string& osPath) {
    detail::QuietGdalErrors oQuiet;
    poDataset.reset();
    if (CPLGetLastErrorType() >= CE_Failure) {
        LUMO_GDAL_FAIL(osPath + ": writing failed" + detail::GdalReason());
    }
}

void WriteCloudOptimized(const std::string& osFrom, const std::string& osTo, int nThreads,
                         ProgressPart& sPart) {
    const std::string osThreads = "NUM_THREADS=" + ThreadsText(nThreads);
    const char* apszArgs[] = {"-of",  "COG", "-co", "COMPRESS=DEFLATE", "-co", osThreads.c_str(),
                              nullptr};
    GDALTranslateOptions* psOptions =
        GDALTranslateOptionsNew(const_cast<char**>(apszArgs), nullptr);
    GDALTranslateOptionsSetProgress(psOptions, ReportProgress, &sPart);
    detail::QuietGdalErrors oQuiet;
    DatasetPtr poSource = detail::OpenRaster(osFrom);
    int bUsageError = FALSE;
    DatasetPtr poCog(GDALTranslate(osTo.c_str(), poSource.get(), psOptions, &bUsageError));
    GDALTranslateOptionsFree(psOptions);
    if (sPart.bCancelled) LUMO_GDAL_FAIL("cancelled");
    if (!poCog) {
        LUMO_GDAL_FAIL(osTo + ": cannot write the cloud-optimised GeoTIFF" + detail::GdalReason());
    }
    CloseWritten(poCog, osTo);
}

// An elevation model that misses the output area entirely would leave every
// height to the fallback: that is a wrong input, not a detail.
void CheckCoverage(const detail::OrthoFrame& oFrame, const OrthoGrid& sGrid,
                   const nova::dem::IRasterDEM& oDem) {
    constexpr int kSamples = 9;
    const double* gt = sGrid.adfGeoTransform;
    for (int j = 0; j < kSamples; ++j) {
        for (int i = 0; i < kSamples; ++i) {
            const double dfX = gt[0] + gt[1] * sGrid.nPixels * (i + 0.5) / kSamples;
            const double dfY = gt[3] + gt[5] * sGrid.nLines * (j + 0.5) / kSamples;
            if (oFrame.InDemCoverage(dfX, dfY)) return;
        }
    }
    LUMO_GDAL_FAIL(oDem.GetDescription() +
                   ": the elevation model does not cover the image "
                   "footprint");
}

std::string TemporaryName(const std::string& osOutput, const char* pszSuffix) {
    return osOutput + "." + std::to_string(::getpid()) + pszSuffix;
}

}  // namespace

OrthoGrid Orthorectify(const std::string& osImage, const nova::mathmodel::IMathModel& oModel,
                       const nova::dem::IRasterDEM& oDem, const std::string& osOutput,
                       const OrthoOptions& sOptions) {
    Initialize();
    detail::RegisterOrthoTransformer();
    CheckOptions(sOptions);
    if (osOutput.empty()) LUMO_GDAL_FAIL("no output file given");
    DatasetPtr poSource = detail::OpenRaster(osImage);
    const SourceBands sBands = ReadSourceBands(poSource.get());
    nova::ogc::CRSPtr poOutputCRS;
    OrthoGrid sGrid =
        detail::PlanGrid(oModel, GDALGetRasterXSize(poSource.get()),
                         GDALGetRasterYSize(poSource.get()), oDem, sOptions, poOutputCRS);
    const double dfNoData = sOptions.bHasNoData     ? sOptions.dfNoData
                            : sBands.abHasNoData[0] ? sBands.adfNoData[0]
                                                    : 0.0;

    auto poFrame = std::make_shared<const detail::OrthoFrame>(oModel, oDem, std::move(poOutputCRS));
    CheckCoverage(*poFrame, sGrid, oDem);
    auto poRun = std::make_shared<const detail::OrthoRun>(
        poFrame, sGrid.adfGeoTransform, sGrid.nPixels, sGrid.nLines, sOptions.dfErrorThreshold);
    std::unique_ptr<void, void (*)(void*)> poTransformer(detail::CreateOrthoTransformer(poRun),
                                                         GDALDestroyTransformer);
    const BlockCacheLimit oCacheLimit;
    TemporaryFile oWarped(TemporaryName(osOutput, ".part.tif"));
    ProgressPart sWarpPart{&sOptions.fnProgress, 0.0,
                           sOptions.bCloudOptimized ? kWarpShareWithCog : 1.0};
    {
        DatasetPtr poOut = CreateOutput(oWarped.Path(), sGrid, sBands, dfNoData, sOptions.nThreads);
        Warp(poSource.get(), poOut.get(), sBands, poTransformer.get(), dfNoData, sOptions,
             sWarpPart);
        const std::string osError = poRun->FirstError();
        if (!osError.empty()) LUMO_GDAL_FAIL(osError);
        CloseWritten(poOut, oWarped.Path());
    }
    std::string osFinal = oWarped.Path();
    TemporaryFile oCog(TemporaryName(osOutput, ".part.cog.tif"));
    if (sOptions.bCloudOptimized) {
        ProgressPart sCogPart{&sOptions.fnProgress, kWarpShareWithCog, 1.0 - kWarpShareWithCog};
        WriteCloudOptimized(oWarped.Path(), oCog.Path(), sOptions.nThreads, sCogPart);
        osFinal = oCog.Path();
    }
    std::error_code oError;
    std::filesystem::rename(osFinal, osOutput, oError);
    if (oError) LUMO_GDAL_FAIL(osOutput + ": cannot write the output file: " + oError.message());
    (sOptions.bCloudOptimized ? oCog : oWarped).Keep();
    return sGrid;
}

}  // namespace gdal
}  // namespace lumo
