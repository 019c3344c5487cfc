// Small rasters written with GDAL for the tests of the GDAL component:
// elevation grids and images with a given georeferencing and pixel function.
#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include <gdal.h>
#include <ogr_srs_api.h>

namespace lumo {
namespace support {

struct RasterSpec {
    int nCols = 0;
    int nRows = 0;
    double adfGeoTransform[6] = {0, 1, 0, 0, 0, -1};
    bool bGeoreferenced = true;
    std::string osSRS = "EPSG:32631";  // anything OSRSetFromUserInput reads; empty: none
    GDALDataType eType = GDT_Float32;
    int nBands = 1;
    bool bHasNoData = false;
    double dfNoData = 0.0;
    std::string osDriver = "GTiff";
};

// Writes a raster whose value at (band, col, row) is fnValue(band, col, row).
inline void WriteRaster(const std::string& osPath, const RasterSpec& sSpec,
                        const std::function<double(int, int, int)>& fnValue) {
    GDALAllRegister();
    GDALDriverH hDriver = GDALGetDriverByName(sSpec.osDriver.c_str());
    ASSERT_NE(hDriver, nullptr);
    GDALDatasetH hDs = GDALCreate(hDriver, osPath.c_str(), sSpec.nCols, sSpec.nRows, sSpec.nBands,
                                  sSpec.eType, nullptr);
    ASSERT_NE(hDs, nullptr) << osPath;
    if (sSpec.bGeoreferenced) GDALSetGeoTransform(hDs, const_cast<double*>(sSpec.adfGeoTransform));
    if (!sSpec.osSRS.empty()) {
        OGRSpatialReferenceH hSRS = OSRNewSpatialReference(nullptr);
        OSRSetFromUserInput(hSRS, sSpec.osSRS.c_str());
        GDALSetSpatialRef(hDs, hSRS);
        OSRDestroySpatialReference(hSRS);
    }
    std::vector<double> adfRow(static_cast<std::size_t>(sSpec.nCols));
    for (int b = 1; b <= sSpec.nBands; ++b) {
        GDALRasterBandH hBand = GDALGetRasterBand(hDs, b);
        if (sSpec.bHasNoData) GDALSetRasterNoDataValue(hBand, sSpec.dfNoData);
        for (int r = 0; r < sSpec.nRows; ++r) {
            for (int c = 0; c < sSpec.nCols; ++c) adfRow[c] = fnValue(b, c, r);
            ASSERT_EQ(GDALRasterIO(hBand, GF_Write, 0, r, sSpec.nCols, 1, adfRow.data(),
                                   sSpec.nCols, 1, GDT_Float64, 0, 0),
                      CE_None);
        }
    }
    GDALClose(hDs);
}

// Reads one band of a raster as doubles, row by row.
inline std::vector<double> ReadBand(const std::string& osPath, int nBand, int* pnCols,
                                    int* pnRows) {
    GDALDatasetH hDs = GDALOpen(osPath.c_str(), GA_ReadOnly);
    EXPECT_NE(hDs, nullptr) << osPath;
    if (hDs == nullptr) return {};
    *pnCols = GDALGetRasterXSize(hDs);
    *pnRows = GDALGetRasterYSize(hDs);
    std::vector<double> adf(static_cast<std::size_t>(*pnCols) * *pnRows);
    EXPECT_EQ(GDALRasterIO(GDALGetRasterBand(hDs, nBand), GF_Read, 0, 0, *pnCols, *pnRows,
                           adf.data(), *pnCols, *pnRows, GDT_Float64, 0, 0),
              CE_None);
    GDALClose(hDs);
    return adf;
}

}  // namespace support
}  // namespace lumo
