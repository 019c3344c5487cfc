// Elevation models over raster files read through GDAL, on the host's tiled
// bilinear grid, registered with the host's factory as the kind "gdal".

#include <cmath>
#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "gdal_common.h"
#include "lumo_gdal.h"

namespace lumo {
namespace gdal {
namespace {

using detail::DatasetPtr;

// GDAL datasets are not safe for concurrent use: every reader takes a handle
// of its own from the pool, opening another when all are busy.
class DatasetPool {
  public:
    DatasetPool(std::string osPath, DatasetPtr poFirst) : mosPath(std::move(osPath)) {
        maoFree.push_back(std::move(poFirst));
    }

    void ReadTile(int nBand, int nCol0, int nRow0, int nCols, int nRows, float* pafOut) {
        DatasetPtr poDataset = Acquire();
        CPLErr eErr = CE_None;
        std::string osReason;
        {
            detail::QuietGdalErrors oQuiet;
            GDALRasterBandH hBand = GDALGetRasterBand(poDataset.get(), nBand);
            eErr = GDALRasterIO(hBand, GF_Read, nCol0, nRow0, nCols, nRows, pafOut, nCols, nRows,
                                GDT_Float32, 0, 0);
            if (eErr != CE_None) osReason = detail::GdalReason();
        }
        Return(std::move(poDataset));
        if (eErr != CE_None) {
            LUMO_GDAL_FAIL(nova::FormatString("%s: cannot read heights at column %d, row %d",
                                              mosPath.c_str(), nCol0, nRow0) +
                           osReason);
        }
    }

  private:
    DatasetPtr Acquire() {
        {
            std::lock_guard<std::mutex> oLock(moMutex);
            if (!maoFree.empty()) {
                DatasetPtr poDataset = std::move(maoFree.back());
                maoFree.pop_back();
                return poDataset;
            }
        }
        return detail::OpenRaster(mosPath);
    }

    void Return(DatasetPtr poDataset) {
        std::lock_guard<std::mutex> oLock(moMutex);
        maoFree.push_back(std::move(poDataset));
    }

    std::string mosPath;
    std::mutex moMutex;
    std::vector<DatasetPtr> maoFree;
};

// How heights are stored in the band: nodata, scale and offset.
struct BandEncoding {
    bool bHasNoData = false;
    double dfNoData = 0.0;
    double dfScale = 1.0;
    double dfOffset = 0.0;

    void Decode(float* pafValues, std::size_t nCount) const {
        for (std::size_t i = 0; i < nCount; ++i) {
            const float fValue = pafValues[i];
            const bool bVoid =
                std::isnan(fValue) || (bHasNoData && fValue == static_cast<float>(dfNoData));
            pafValues[i] = bVoid ? std::nanf("") : static_cast<float>(fValue * dfScale + dfOffset);
        }
    }
};

BandEncoding ReadEncoding(GDALRasterBandH hBand) {
    BandEncoding sEncoding;
    int bHas = FALSE;
    sEncoding.dfNoData = GDALGetRasterNoDataValue(hBand, &bHas);
    sEncoding.bHasNoData = bHas != FALSE;
    sEncoding.dfScale = GDALGetRasterScale(hBand, nullptr);
    sEncoding.dfOffset = GDALGetRasterOffset(hBand, nullptr);
    return sEncoding;
}

nova::ogc::cs::DatumType VerticalDatum(HeightReference eHeights, const nova::ogc::cs::ICRS& oFile) {
    switch (eHeights) {
        case HeightReference::kMeanSeaLevel:
            return nova::ogc::cs::CS_VD_Orthometric;
        case HeightReference::kEllipsoid:
            return nova::ogc::cs::CS_VD_Ellipsoidal;
        case HeightReference::kFromFile:
            break;
    }
    // Elevation files without a vertical system give heights above mean sea
    // level far more often than above the ellipsoid.
    return oFile.GetVerticalDatumType() == nova::ogc::cs::CS_VD_Ellipsoidal
               ? nova::ogc::cs::CS_VD_Ellipsoidal
               : nova::ogc::cs::CS_VD_Orthometric;
}

// Node (col, row) at the centre of cell (col, row); the coverage is the
// raster's footprint.
nova::dem::GridLayout LayoutOf(const std::string& osPath, GDALDatasetH hDataset, bool bGeographic) {
    double adfGT[6] = {};
    if (GDALGetGeoTransform(hDataset, adfGT) != CE_None) {
        LUMO_GDAL_FAIL(osPath + ": the elevation file has no georeferencing (geotransform)");
    }
    if (adfGT[2] != 0.0 || adfGT[4] != 0.0 || adfGT[1] == 0.0 || adfGT[5] == 0.0) {
        LUMO_GDAL_FAIL(nova::FormatString(
            "%s: rotated or degenerate elevation grids are not supported (geotransform %g %g %g "
            "%g %g %g)",
            osPath.c_str(), adfGT[0], adfGT[1], adfGT[2], adfGT[3], adfGT[4], adfGT[5]));
    }
    nova::dem::GridLayout sLayout;
    sLayout.nCols = GDALGetRasterXSize(hDataset);
    sLayout.nRows = GDALGetRasterYSize(hDataset);
    sLayout.dfStepX = adfGT[1];
    sLayout.dfStepY = adfGT[5];
    sLayout.dfOriginX = adfGT[0] + 0.5 * adfGT[1];
    sLayout.dfOriginY = adfGT[3] + 0.5 * adfGT[5];
    const double dfX1 = adfGT[0] + sLayout.nCols * adfGT[1];
    const double dfY1 = adfGT[3] + sLayout.nRows * adfGT[5];
    sLayout.sCoverage = {std::fmin(adfGT[0], dfX1), std::fmin(adfGT[3], dfY1),
                         std::fmax(adfGT[0], dfX1), std::fmax(adfGT[3], dfY1)};
    // A global geographic grid continues across the antimeridian.
    sLayout.bWrapsLongitude = bGeographic && std::fabs(std::fabs(sLayout.nCols * adfGT[1]) -
                                                       360.0) < 0.5 * std::fabs(adfGT[1]);
    return sLayout;
}

}  // namespace

nova::dem::IRasterDEM* OpenFileDEM(const std::string& osPath, const FileDEMOptions& sOptions) {
    if (sOptions.nCacheMegabytes < 1) {
        throw nova::ParameterException(
            "nCacheMegabytes", 1, "", "",
            nova::FormatString("Invalid elevation cache size %d MB", sOptions.nCacheMegabytes),
            __FILE__, __func__, __LINE__);
    }
    DatasetPtr poDataset = detail::OpenRaster(osPath);
    GDALDatasetH hDataset = poDataset.get();
    const int nBands = GDALGetRasterCount(hDataset);
    if (sOptions.nBand < 1 || sOptions.nBand > nBands) {
        LUMO_GDAL_FAIL(nova::FormatString("%s: no band %d (the file has %d)", osPath.c_str(),
                                          sOptions.nBand, nBands));
    }
    nova::ogc::CRSPtr poFileCRS = detail::CRSFromGdal(GDALGetSpatialRef(hDataset), osPath);
    if (!poFileCRS) LUMO_GDAL_FAIL(osPath + ": the elevation file has no coordinate system");
    if (!poFileCRS->IsGeographic() && !poFileCRS->IsProjected()) {
        LUMO_GDAL_FAIL(osPath + ": the elevation file's coordinate system " + poFileCRS->GetName() +
                       " is neither geographic nor projected");
    }
    nova::ogc::CRSPtr poCRS(nova::ogc::utils::CreateCompoundCS(
        poFileCRS.get(), VerticalDatum(sOptions.eHeights, *poFileCRS)));
    const nova::dem::GridLayout sLayout = LayoutOf(osPath, hDataset, poFileCRS->IsGeographic());
    const BandEncoding sEncoding = ReadEncoding(GDALGetRasterBand(hDataset, sOptions.nBand));

    auto poPool = std::make_shared<DatasetPool>(osPath, std::move(poDataset));
    const int nBand = sOptions.nBand;
    auto fnRead = [poPool, nBand, sEncoding](int nCol0, int nRow0, int nCols, int nRows,
                                             float* pafOut) {
        poPool->ReadTile(nBand, nCol0, nRow0, nCols, nRows, pafOut);
        sEncoding.Decode(pafOut, static_cast<std::size_t>(nCols) * nRows);
    };
    nova::dem::DEMPtr poDem(
        nova::dem::CreateGridDEM(std::move(poCRS), sLayout, fnRead,
                                 static_cast<std::size_t>(sOptions.nCacheMegabytes) << 20, osPath));
    if (!sOptions.bGeoidFallback) return poDem.release();
    return nova::dem::WithGeoidFallback(std::move(poDem));
}

// The factory's kind "gdal": any raster GDAL opens, with the default options;
// other sources are left to other kinds.
void RegisterFileDEMKind() {
    nova::dem::DEMFactory::RegisterKind(
        "gdal", [](const std::string& osSource, int nCacheMegabytes) -> nova::dem::IRasterDEM* {
            {
                detail::QuietGdalErrors oQuiet;
                DatasetPtr poProbe(GDALOpenEx(osSource.c_str(), GDAL_OF_RASTER | GDAL_OF_READONLY,
                                              nullptr, nullptr, nullptr));
                if (!poProbe) return nullptr;
            }
            FileDEMOptions sOptions;
            sOptions.nCacheMegabytes = nCacheMegabytes;
            return OpenFileDEM(osSource, sOptions);
        });
}

}  // namespace gdal
}  // namespace lumo
