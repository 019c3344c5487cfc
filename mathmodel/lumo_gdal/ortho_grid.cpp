// The output grid of an orthorectification: CRS, resolution and extent, by
// default from the model's footprint on the elevation model.

#include <algorithm>
#include <cctype>
#include <cmath>
#include <string>
#include <vector>

#include "gdal_common.h"
#include "lumo_gdal.h"
#include "ortho_frame.h"
#include "ortho_grid.h"

namespace lumo {
namespace gdal {
namespace detail {
namespace {

// Points traced along each image edge for the footprint.
constexpr int kEdgeSamples = 32;
// Largest output side accepted, in pixels.
constexpr double kMaxOutputSide = 1 << 20;

struct Box {
    double dfMinX = HUGE_VAL;
    double dfMinY = HUGE_VAL;
    double dfMaxX = -HUGE_VAL;
    double dfMaxY = -HUGE_VAL;
    int nPoints = 0;

    void Add(double dfX, double dfY) {
        dfMinX = std::min(dfMinX, dfX);
        dfMinY = std::min(dfMinY, dfY);
        dfMaxX = std::max(dfMaxX, dfX);
        dfMaxY = std::max(dfMaxY, dfY);
        ++nPoints;
    }
};

// The image border and centre mapped to the ground of a frame.
Box Footprint(const OrthoFrame& oFrame, int nPixels, int nLines, int& nTried) {
    std::vector<std::pair<double, double>> aImage;
    for (int i = 0; i <= kEdgeSamples; ++i) {
        const double dfP = nPixels * static_cast<double>(i) / kEdgeSamples;
        const double dfL = nLines * static_cast<double>(i) / kEdgeSamples;
        aImage.emplace_back(dfP, 0.0);
        aImage.emplace_back(dfP, nLines);
        aImage.emplace_back(0.0, dfL);
        aImage.emplace_back(nPixels, dfL);
    }
    aImage.emplace_back(0.5 * nPixels, 0.5 * nLines);
    Box sBox;
    for (const auto& [dfPixel, dfLine] : aImage) {
        double dfX = 0.0;
        double dfY = 0.0;
        if (oFrame.ImageToGround(dfPixel, dfLine, dfX, dfY)) sBox.Add(dfX, dfY);
    }
    nTried = static_cast<int>(aImage.size());
    return sBox;
}

std::string Trimmed(const std::string& osText) {
    const std::size_t nFirst = osText.find_first_not_of(" \t");
    if (nFirst == std::string::npos) return std::string();
    return osText.substr(nFirst, osText.find_last_not_of(" \t") - nFirst + 1);
}

nova::ogc::CRSPtr UtmZoneOf(double dfLon, double dfLat) {
    const int nZone = std::clamp(static_cast<int>(std::floor((dfLon + 180.0) / 6.0)) + 1, 1, 60);
    const int nCode = (dfLat >= 0.0 ? 32600 : 32700) + nZone;
    return nova::ogc::CRSPtr(
        nova::ogc::utils::CreateCRSFromDefinition("EPSG:" + std::to_string(nCode)));
}

// Three significant digits: 0.4987 m becomes 0.499 m.
double RoundResolution(double dfValue) {
    const double dfUnit = std::pow(10.0, std::floor(std::log10(dfValue)) - 2.0);
    return std::round(dfValue / dfUnit) * dfUnit;
}

// Ground size of one image pixel at the image centre, in output CRS units.
double GroundSampleDistance(const OrthoFrame& oFrame, int nPixels, int nLines) {
    const double dfP = 0.5 * nPixels;
    const double dfL = 0.5 * nLines;
    double adfX[3] = {};
    double adfY[3] = {};
    const double adfP[3] = {dfP, dfP + 1.0, dfP};
    const double adfL[3] = {dfL, dfL, dfL + 1.0};
    for (int i = 0; i < 3; ++i) {
        if (!oFrame.ImageToGround(adfP[i], adfL[i], adfX[i], adfY[i])) {
            LUMO_GDAL_FAIL(
                "the model's ground sample distance cannot be computed at the image "
                "centre; give the resolution");
        }
    }
    const double dfArea = std::fabs((adfX[1] - adfX[0]) * (adfY[2] - adfY[0]) -
                                    (adfY[1] - adfY[0]) * (adfX[2] - adfX[0]));
    if (!(dfArea > 0.0) || !std::isfinite(dfArea)) {
        LUMO_GDAL_FAIL(
            "the model maps the image centre's pixel to no ground area; give the "
            "resolution");
    }
    return RoundResolution(std::sqrt(dfArea));
}

}  // namespace

nova::ogc::CRSPtr ParseOutputCRS(const std::string& osText) {
    std::string osDefinition = Trimmed(osText);
    if (!osDefinition.empty() &&
        osDefinition.find_first_not_of("0123456789") == std::string::npos) {
        osDefinition = "EPSG:" + osDefinition;
    }
    // PROJ strings name a CRS only with +type=crs.
    if (osDefinition.rfind("+proj", 0) == 0 &&
        osDefinition.find("+type=crs") == std::string::npos) {
        osDefinition += " +type=crs";
    }
    nova::ogc::CRSPtr poCRS;
    try {
        poCRS.reset(nova::ogc::utils::CreateCRSFromDefinition(osDefinition));
    } catch (const nova::Exception& e) {
        LUMO_GDAL_FAIL("output CRS \"" + osText + "\" is not a coordinate system: " + e.what());
    }
    if (!poCRS->IsGeographic() && !poCRS->IsProjected()) {
        LUMO_GDAL_FAIL("output CRS \"" + osText + "\" is neither geographic nor projected");
    }
    return poCRS;
}

OrthoGrid PlanGrid(const nova::mathmodel::IMathModel& oModel, int nImagePixels, int nImageLines,
                   const nova::dem::IRasterDEM& oDem, const OrthoOptions& sOptions,
                   nova::ogc::CRSPtr& poOutput) {
    if (nImagePixels < 1 || nImageLines < 1) {
        LUMO_GDAL_FAIL(nova::FormatString("invalid image size %d x %d", nImagePixels, nImageLines));
    }
    if (sOptions.dfResolution < 0.0 || !std::isfinite(sOptions.dfResolution)) {
        LUMO_GDAL_FAIL(nova::FormatString("invalid resolution %g", sOptions.dfResolution));
    }
    const nova::ogc::cs::ICRS* poModelCRS = oModel.GetCRS();
    if (poModelCRS == nullptr) LUMO_GDAL_FAIL("the math model has no coordinate system");
    if (!sOptions.osOutputCRS.empty()) {
        poOutput = ParseOutputCRS(sOptions.osOutputCRS);
    } else if (poModelCRS->IsProjected()) {
        poOutput.reset(poModelCRS->Clone());
    } else {
        // The UTM zone of the footprint's centre, found in longitude and latitude.
        nova::ogc::CRSPtr poGeographic(nova::ogc::utils::CreateCRSFromDefinition("EPSG:4326"));
        const OrthoFrame oGeo(oModel, oDem, std::move(poGeographic));
        double dfLon = 0.0;
        double dfLat = 0.0;
        if (!oGeo.ImageToGround(0.5 * nImagePixels, 0.5 * nImageLines, dfLon, dfLat)) {
            LUMO_GDAL_FAIL(
                "the model's footprint cannot be computed: the image centre does not "
                "map to the ground of " +
                oDem.GetDescription());
        }
        poOutput = UtmZoneOf(dfLon, dfLat);
    }
    const OrthoFrame oFrame(oModel, oDem, nova::ogc::CRSPtr(poOutput->Clone()));
    Box sBox;
    if (sOptions.bHasExtent) {
        sBox.Add(sOptions.adfExtent[0], sOptions.adfExtent[1]);
        sBox.Add(sOptions.adfExtent[2], sOptions.adfExtent[3]);
        if (!(sOptions.adfExtent[2] > sOptions.adfExtent[0]) ||
            !(sOptions.adfExtent[3] > sOptions.adfExtent[1])) {
            LUMO_GDAL_FAIL(nova::FormatString(
                "invalid extent %g %g %g %g (min X, min Y, max X, max Y)", sOptions.adfExtent[0],
                sOptions.adfExtent[1], sOptions.adfExtent[2], sOptions.adfExtent[3]));
        }
    } else {
        int nTried = 0;
        sBox = Footprint(oFrame, nImagePixels, nImageLines, nTried);
        if (sBox.nPoints < nTried / 2) {
            LUMO_GDAL_FAIL(nova::FormatString(
                "the model's footprint cannot be computed: only %d of %d image border points map "
                "to the ground of %s",
                sBox.nPoints, nTried, oDem.GetDescription().c_str()));
        }
    }
    const double dfRes = sOptions.dfResolution > 0.0
                             ? sOptions.dfResolution
                             : GroundSampleDistance(oFrame, nImagePixels, nImageLines);
    OrthoGrid sGrid;
    const double dfMinX = std::floor(sBox.dfMinX / dfRes) * dfRes;
    const double dfMaxY = std::ceil(sBox.dfMaxY / dfRes) * dfRes;
    const double dfCols = std::ceil(sBox.dfMaxX / dfRes) - std::floor(sBox.dfMinX / dfRes);
    const double dfRows = std::ceil(sBox.dfMaxY / dfRes) - std::floor(sBox.dfMinY / dfRes);
    if (!(dfCols >= 1.0 && dfRows >= 1.0 && dfCols <= kMaxOutputSide && dfRows <= kMaxOutputSide)) {
        LUMO_GDAL_FAIL(nova::FormatString(
            "the output would be %.0f x %.0f pixels at resolution %g; give a coarser resolution "
            "or a smaller extent",
            dfCols, dfRows, dfRes));
    }
    sGrid.nPixels = static_cast<int>(dfCols);
    sGrid.nLines = static_cast<int>(dfRows);
    const double adfGT[6] = {dfMinX, dfRes, 0.0, dfMaxY, 0.0, -dfRes};
    std::copy(adfGT, adfGT + 6, sGrid.adfGeoTransform);
    sGrid.osCRS = poOutput->ExportToWkt();
    return sGrid;
}

}  // namespace detail

OrthoGrid PlanOrthoGrid(const nova::mathmodel::IMathModel& oModel, int nImagePixels,
                        int nImageLines, const nova::dem::IRasterDEM& oDem,
                        const OrthoOptions& sOptions) {
    nova::ogc::CRSPtr poOutput;
    return detail::PlanGrid(oModel, nImagePixels, nImageLines, oDem, sOptions, poOutput);
}

}  // namespace gdal
}  // namespace lumo
