// Small rasters written with GDAL for the tests of the GDAL component:
// elevation grids and images with a given georeferencing and pixel function.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <functional>
#include <initializer_list>
#include <string>
#include <vector>

#include <gdal.h>
#include <gdal_alg.h>
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
    double dfScale = 1.0;  // stored scale and offset of every band
    double dfOffset = 0.0;
    std::string osDriver = "GTiff";
};

// An image of the given size, bands and type without georeferencing.
inline RasterSpec PlainImage(int nCols, int nRows, int nBands = 1,
                             GDALDataType eType = GDT_Float32) {
    RasterSpec s;
    s.nCols = nCols;
    s.nRows = nRows;
    s.nBands = nBands;
    s.eType = eType;
    s.bGeoreferenced = false;
    s.osSRS.clear();
    return s;
}

// A north-up grid of square cells of dfCell whose top left corner is at
// (dfX0, dfY0) in osSRS.
inline RasterSpec NorthUpGrid(int nCols, int nRows, const std::string& osSRS, double dfX0,
                              double dfY0, double dfCell) {
    RasterSpec s;
    s.nCols = nCols;
    s.nRows = nRows;
    s.osSRS = osSRS;
    const double adfGT[6] = {dfX0, dfCell, 0.0, dfY0, 0.0, -dfCell};
    std::copy(adfGT, adfGT + 6, s.adfGeoTransform);
    return s;
}

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
        if (sSpec.dfScale != 1.0) GDALSetRasterScale(hBand, sSpec.dfScale);
        if (sSpec.dfOffset != 0.0) GDALSetRasterOffset(hBand, sSpec.dfOffset);
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

// A ground point and its image position: X, Y, Z, pixel, line.
using ImagePoint = std::array<double, 5>;

// Largest distance, in pixels, between the given image positions and those
// GDAL's own RPC transformer computes from the raster's RPC metadata.
inline double GdalRpcDisagreement(const std::string& osRaster,
                                  const std::vector<ImagePoint>& aPoints) {
    GDALDatasetH hDs = GDALOpen(osRaster.c_str(), GA_ReadOnly);
    if (hDs == nullptr) return HUGE_VAL;
    GDALRPCInfoV2 sInfo{};
    const bool bRead = GDALExtractRPCInfoV2(GDALGetMetadata(hDs, "RPC"), &sInfo);
    GDALClose(hDs);
    void* pTransformer = bRead ? GDALCreateRPCTransformerV2(&sInfo, FALSE, 0.0, nullptr) : nullptr;
    if (pTransformer == nullptr) return HUGE_VAL;
    double dfWorst = 0.0;
    for (const ImagePoint& a : aPoints) {
        double dfX = a[0], dfY = a[1], dfZ = a[2];
        int bOk = FALSE;
        // Ground to image is the transformer's inverse direction.
        GDALRPCTransform(pTransformer, TRUE, 1, &dfX, &dfY, &dfZ, &bOk);
        dfWorst = bOk ? std::max(dfWorst, std::hypot(dfX - a[3], dfY - a[4])) : HUGE_VAL;
    }
    GDALDestroyRPCTransformer(pTransformer);
    return dfWorst;
}

// Whether `text` contains every one of `parts`.
inline bool Names(const std::string& text, std::initializer_list<std::string> parts) {
    for (const std::string& part : parts)
        if (text.find(part) == std::string::npos) return false;
    return true;
}

}  // namespace support
}  // namespace lumo
