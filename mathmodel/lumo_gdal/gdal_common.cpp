#include "gdal_common.h"

#include <filesystem>
#include <mutex>

#include <cpl_conv.h>
#include <cpl_error.h>

#include "lumo_gdal.h"
#include "runtime.h"

namespace lumo {
namespace gdal {

void RegisterFileDEMKind();

void Initialize() {
    static std::once_flag oOnce;
    std::call_once(oOnce, [] {
        GDALAllRegister();
        RegisterFileDEMKind();
    });
}

namespace detail {

std::string GdalReason() {
    const char* pszMessage = CPLGetLastErrorMsg();
    if (pszMessage == nullptr || *pszMessage == '\0') return std::string();
    return std::string(" (GDAL: ") + pszMessage + ")";
}

QuietGdalErrors::QuietGdalErrors() {
    CPLPushErrorHandler(CPLQuietErrorHandler);
    CPLErrorReset();
}

QuietGdalErrors::~QuietGdalErrors() {
    CPLPopErrorHandler();
}

DatasetPtr OpenRaster(const std::string& osPath, bool bUpdate) {
    Initialize();
    std::error_code oError;
    // Virtual paths (/vsizip/...) are GDAL's to judge; plain ones are
    // checked first so that a missing file is named as such.
    if (osPath.rfind("/vsi", 0) != 0 && !std::filesystem::exists(osPath, oError)) {
        LUMO_GDAL_FAIL(osPath + ": no such file");
    }
    QuietGdalErrors oQuiet;
    const unsigned nFlags =
        GDAL_OF_RASTER | (bUpdate ? GDAL_OF_UPDATE : GDAL_OF_READONLY) | GDAL_OF_VERBOSE_ERROR;
    DatasetPtr poDataset(GDALOpenEx(osPath.c_str(), nFlags, nullptr, nullptr, nullptr));
    if (!poDataset) LUMO_GDAL_FAIL(osPath + ": not a raster GDAL can read" + GdalReason());
    if (GDALGetRasterXSize(poDataset.get()) < 1 || GDALGetRasterYSize(poDataset.get()) < 1 ||
        GDALGetRasterCount(poDataset.get()) < 1) {
        LUMO_GDAL_FAIL(osPath + ": the raster has no pixels or no bands");
    }
    return poDataset;
}

std::string WktOf(OGRSpatialReferenceH hSRS) {
    if (hSRS == nullptr) return std::string();
    char* pszWkt = nullptr;
    const char* apszOptions[] = {"FORMAT=WKT2_2019", nullptr};
    QuietGdalErrors oQuiet;
    if (OSRExportToWktEx(hSRS, &pszWkt, apszOptions) != OGRERR_NONE || pszWkt == nullptr) {
        CPLFree(pszWkt);
        return std::string();
    }
    std::string osWkt(pszWkt);
    CPLFree(pszWkt);
    return osWkt;
}

nova::ogc::CRSPtr CRSFromGdal(OGRSpatialReferenceH hSRS, const std::string& osSource) {
    if (hSRS == nullptr) return nullptr;
    const std::string osWkt = WktOf(hSRS);
    if (osWkt.empty())
        LUMO_GDAL_FAIL(osSource + ": its coordinate system cannot be expressed as WKT");
    try {
        return nova::ogc::CRSPtr(nova::ogc::utils::CreateCRSFromDefinition(osWkt));
    } catch (const nova::Exception& e) {
        LUMO_GDAL_FAIL(osSource + ": unknown coordinate system: " + e.what());
    }
}

}  // namespace detail
}  // namespace gdal
}  // namespace lumo
