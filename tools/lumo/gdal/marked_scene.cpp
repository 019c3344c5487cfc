#include "marked_scene.h"

#include <algorithm>
#include <cmath>
#include <stdexcept>
#include <vector>

#include <gdal.h>

#include "cli_error.h"
#include "lumo.h"

namespace lumo::cli {
namespace {

// Marks are Gaussian spots of this standard deviation, in image pixels.
constexpr double kMarkSigmaPixels = 1.5;
constexpr double kMarkPeak = 1000.0;
// Hill shading: brightness of flat ground, its range, and the light from the
// north-west, 45 degrees up.
constexpr double kShadeBase = 60.0;
constexpr double kShadeRange = 120.0;
constexpr double kShadeStep = 10.0;         // metres, for the slope
constexpr double kShadeExaggeration = 3.0;  // of the slopes, so gentle hills show
// Half size of the window in which a mark's centroid is measured, in
// output pixels: beyond four standard deviations of a mark.
constexpr int kWindowHalf = 6;

struct DatasetCloser {
    void operator()(void* h) const { GDALClose(static_cast<GDALDatasetH>(h)); }
};
using Dataset = std::unique_ptr<void, DatasetCloser>;

void WriteFloatImage(const std::string& path, int nPixels, int nLines, std::vector<float>& afData) {
    GDALAllRegister();
    GDALDriverH hDriver = GDALGetDriverByName("GTiff");
    const char* apszOptions[] = {"TILED=YES", "COMPRESS=DEFLATE", nullptr};
    Dataset poOut(GDALCreate(hDriver, path.c_str(), nPixels, nLines, 1, GDT_Float32,
                             const_cast<char**>(apszOptions)));
    if (!poOut) LUMO_CLI_FAIL(path + ": cannot create the simulated image");
    GDALRasterBandH hBand = GDALGetRasterBand(poOut.get(), 1);
    GDALSetRasterNoDataValue(hBand, std::nan(""));
    if (GDALRasterIO(hBand, GF_Write, 0, 0, nPixels, nLines, afData.data(), nPixels, nLines,
                     GDT_Float32, 0, 0) != CE_None) {
        LUMO_CLI_FAIL(path + ": cannot write the simulated image");
    }
}

// Control points anywhere in the scene's volume serve: they are exact.
SritPtr FitRigorousModel(const lumo::sim::Scene& oScene, int nGcps) {
    const std::vector<lumo::sim::SimPoint> asGcps = oScene.SamplePoints(nGcps, 7, -100.0, 2500.0);
    std::vector<double> p, l, x, y, z;
    for (const lumo::sim::SimPoint& s : asGcps) {
        p.push_back(s.dfPixel);
        l.push_back(s.dfLine);
        x.push_back(s.dfX);
        y.push_back(s.dfY);
        z.push_back(s.dfZ);
    }
    SritPtr psModel(SRITAllocate());
    psModel->anAux[SRIT_AUX_FORM] = SRIT_FORM_CURVED_INCIDENCE;  // as lumo fit computes it
    EphemerisSeg_t* psSegment = oScene.MakeSegment();
    if (SRITCalculate(psModel.get(), true, psSegment, nGcps, &oScene.Projection(), p.data(),
                      l.data(), z.data(), x.data(), y.data()) != 1) {
        LumoSatEphemerisFree(psSegment);
        LUMO_CLI_FAIL("the rigorous model of the simulated scene could not be computed");
    }
    return psModel;
}

// Ground brightness from the terrain's slope towards the light.
lumo::sim::RadianceFn HillShade(const nova::dem::IRasterDEM& oDem) {
    return [&oDem](double dfX, double dfY) {
        double dfE = 0.0, dfW = 0.0, dfN = 0.0, dfS = 0.0;
        if (!oDem.GetHeight(dfX + kShadeStep, dfY, dfE) ||
            !oDem.GetHeight(dfX - kShadeStep, dfY, dfW) ||
            !oDem.GetHeight(dfX, dfY + kShadeStep, dfN) ||
            !oDem.GetHeight(dfX, dfY - kShadeStep, dfS)) {
            return kShadeBase;
        }
        const double dfGx = kShadeExaggeration * (dfE - dfW) / (2 * kShadeStep);
        const double dfGy = kShadeExaggeration * (dfN - dfS) / (2 * kShadeStep);
        // Unit normal (-gx, -gy, 1) against the light (-1, 1, sqrt 2) / 2.
        const double dfLight =
            (dfGx - dfGy + std::sqrt(2.0)) / (2.0 * std::sqrt(1.0 + dfGx * dfGx + dfGy * dfGy));
        return kShadeBase + kShadeRange * std::max(0.0, dfLight);
    };
}

}  // namespace

MarkedScene MakeMarkedScene(const lumo::sim::SceneParams& sParams,
                            const nova::dem::IRasterDEM& oDem, int nMarksPerSide, int nGcps,
                            const std::string& osImagePath) {
    const lumo::sim::Scene oScene(sParams);
    const lumo::sim::TerrainFn fnTerrain = [&oDem](double dfX, double dfY, double* pdfZ) {
        return oDem.GetHeight(dfX, dfY, *pdfZ);
    };
    MarkedScene sScene;
    sScene.fnGround = HillShade(oDem);
    // Marks where the image sees the terrain at a grid of image positions.
    for (int j = 0; j < nMarksPerSide; ++j) {
        for (int i = 0; i < nMarksPerSide; ++i) {
            const double dfPixel = sParams.nPixels * (0.15 + 0.7 * i / (nMarksPerSide - 1.0));
            const double dfLine = sParams.nLines * (0.15 + 0.7 * j / (nMarksPerSide - 1.0));
            lumo::sim::SimPoint sSeen{};
            if (!lumo::sim::SeeTerrain(oScene, dfPixel, dfLine, fnTerrain, 0.0, &sSeen)) {
                LUMO_CLI_FAIL("the simulated scene does not see the elevation model's terrain");
            }
            sScene.asMarks.push_back({sSeen.dfX, sSeen.dfY});
        }
    }
    const double dfSigma = kMarkSigmaPixels * sParams.dfIFOV * (sParams.dfOrbitRadius - 6378137.0);
    const lumo::sim::RadianceFn fnMarks =
        lumo::sim::MarkedGround(sScene.asMarks, dfSigma, 0.0, kMarkPeak);
    const lumo::sim::RadianceFn& fnGround = sScene.fnGround;
    std::vector<float> afImage = lumo::sim::RenderImage(
        oScene, fnTerrain,
        [&](double dfX, double dfY) { return fnGround(dfX, dfY) + fnMarks(dfX, dfY); });
    WriteFloatImage(osImagePath, sParams.nPixels, sParams.nLines, afImage);
    sScene.psModel = FitRigorousModel(oScene, nGcps);
    return sScene;
}

MarkStats MeasureMarks(const std::string& osOrtho, const MarkedScene& sScene) {
    GDALAllRegister();
    Dataset poOrtho(GDALOpen(osOrtho.c_str(), GA_ReadOnly));
    if (!poOrtho) LUMO_CLI_FAIL(osOrtho + ": cannot open the orthoimage");
    double gt[6] = {};
    GDALGetGeoTransform(poOrtho.get(), gt);
    const int nCols = GDALGetRasterXSize(poOrtho.get());
    const int nRows = GDALGetRasterYSize(poOrtho.get());
    GDALRasterBandH hBand = GDALGetRasterBand(poOrtho.get(), 1);
    const double dfNoData = GDALGetRasterNoDataValue(hBand, nullptr);
    MarkStats sStats;
    double dfSumSquares = 0.0;
    std::vector<double> adfWindow((2 * kWindowHalf + 1) * (2 * kWindowHalf + 1));
    for (const lumo::sim::GroundMark& sMark : sScene.asMarks) {
        ++sStats.nMarks;
        const double dfCol = (sMark.dfX - gt[0]) / gt[1];
        const double dfRow = (sMark.dfY - gt[3]) / gt[5];
        const int nCol0 = static_cast<int>(std::floor(dfCol)) - kWindowHalf;
        const int nRow0 = static_cast<int>(std::floor(dfRow)) - kWindowHalf;
        const int nSide = 2 * kWindowHalf + 1;
        if (nCol0 < 0 || nRow0 < 0 || nCol0 + nSide > nCols || nRow0 + nSide > nRows) continue;
        if (GDALRasterIO(hBand, GF_Read, nCol0, nRow0, nSide, nSide, adfWindow.data(), nSide, nSide,
                         GDT_Float64, 0, 0) != CE_None) {
            continue;
        }
        double dfSum = 0.0, dfSumC = 0.0, dfSumR = 0.0;
        for (int r = 0; r < nSide; ++r) {
            for (int c = 0; c < nSide; ++c) {
                const double dfValue = adfWindow[r * nSide + c];
                if (dfValue == dfNoData || std::isnan(dfValue)) continue;
                const double dfC = nCol0 + c + 0.5;
                const double dfR = nRow0 + r + 0.5;
                const double dfGround = sScene.fnGround(gt[0] + dfC * gt[1], gt[3] + dfR * gt[5]);
                const double dfWeight = std::max(0.0, dfValue - dfGround);
                dfSum += dfWeight;
                dfSumC += dfWeight * dfC;
                dfSumR += dfWeight * dfR;
            }
        }
        if (!(dfSum > 0.0)) continue;
        const double dfError = std::hypot(dfSumC / dfSum - dfCol, dfSumR / dfSum - dfRow);
        ++sStats.nFound;
        sStats.dfMax = std::max(sStats.dfMax, dfError);
        dfSumSquares += dfError * dfError;
    }
    sStats.dfRms = sStats.nFound > 0 ? std::sqrt(dfSumSquares / sStats.nFound) : 0.0;
    return sStats;
}

}  // namespace lumo::cli
