// What an image file says about itself: size, bands, georeferencing, control
// points and rational polynomials, read through GDAL; and rational
// polynomials written into a GeoTIFF.

#include <cctype>
#include <map>
#include <sstream>
#include <string>
#include <vector>

#include <cpl_string.h>

#include "gdal_common.h"
#include "lumo_gdal.h"

namespace lumo {
namespace gdal {
namespace {

using detail::DatasetPtr;

constexpr const char* kRpcDomain = "RPC";
constexpr const char* kCoefficientKeys[] = {"LINE_NUM_COEFF", "LINE_DEN_COEFF", "SAMP_NUM_COEFF",
                                            "SAMP_DEN_COEFF"};

bool IsCoefficientKey(const std::string& osKey) {
    for (const char* pszKey : kCoefficientKeys) {
        if (osKey == pszKey) return true;
    }
    return false;
}

// GDAL's RPC metadata ("KEY=value", coefficients as one list of 20) as the
// "KEY: value" text of an _RPC.TXT file, so that one reader checks every
// field whatever the image's format.
std::string MetadataToRpcText(CSLConstList papszMetadata) {
    std::string osText;
    for (CSLConstList papszIter = papszMetadata; *papszIter != nullptr; ++papszIter) {
        char* pszKey = nullptr;
        const char* pszValue = CPLParseNameValue(*papszIter, &pszKey);
        if (pszKey == nullptr || pszValue == nullptr) {
            CPLFree(pszKey);
            continue;
        }
        const std::string osKey(pszKey);
        CPLFree(pszKey);
        if (!IsCoefficientKey(osKey)) {
            osText += osKey + ": " + pszValue + "\n";
            continue;
        }
        std::istringstream oValues(pszValue);
        std::string osValue;
        for (int i = 1; oValues >> osValue; ++i) {
            osText.append(osKey).append("_").append(std::to_string(i)).append(": ");
            osText.append(osValue).append("\n");
        }
    }
    return osText;
}

// The reverse: an _RPC.TXT text as GDAL's RPC metadata, units dropped.
std::vector<std::string> RpcTextToMetadata(const std::string& osText) {
    std::map<std::string, std::string> oCoefficients;
    std::vector<std::string> aosItems;
    std::istringstream oLines(osText);
    std::string osLine;
    while (std::getline(oLines, osLine)) {
        const std::size_t nColon = osLine.find(':');
        if (nColon == std::string::npos) continue;
        std::string osKey = osLine.substr(0, nColon);
        std::istringstream oValue(osLine.substr(nColon + 1));
        std::string osValue;
        oValue >> osValue;
        const std::size_t nUnderscore = osKey.rfind('_');
        const std::string osBase = osKey.substr(0, nUnderscore);
        if (nUnderscore != std::string::npos && IsCoefficientKey(osBase)) {
            std::string& osList = oCoefficients[osBase];
            if (!osList.empty()) osList += ' ';
            osList += osValue;
        } else {
            aosItems.push_back(osKey.append("=").append(osValue));
        }
    }
    for (const auto& [osKey, osList] : oCoefficients) {
        aosItems.push_back(std::string(osKey).append("=").append(osList));
    }
    return aosItems;
}

std::vector<ImageGCP> ReadGCPs(GDALDatasetH hDataset) {
    std::vector<ImageGCP> asGCPs;
    const int nCount = GDALGetGCPCount(hDataset);
    const GDAL_GCP* pasGCPs = GDALGetGCPs(hDataset);
    for (int i = 0; i < nCount && pasGCPs != nullptr; ++i) {
        ImageGCP sGCP;
        sGCP.osId = pasGCPs[i].pszId != nullptr && *pasGCPs[i].pszId != '\0'
                        ? pasGCPs[i].pszId
                        : std::to_string(i + 1);
        sGCP.dfPixel = pasGCPs[i].dfGCPPixel;
        sGCP.dfLine = pasGCPs[i].dfGCPLine;
        sGCP.dfX = pasGCPs[i].dfGCPX;
        sGCP.dfY = pasGCPs[i].dfGCPY;
        sGCP.dfZ = pasGCPs[i].dfGCPZ;
        asGCPs.push_back(sGCP);
    }
    return asGCPs;
}

}  // namespace

ImageInfo ReadImageInfo(const std::string& osPath) {
    DatasetPtr poDataset = detail::OpenRaster(osPath);
    GDALDatasetH hDataset = poDataset.get();
    ImageInfo sInfo;
    sInfo.osDriver = GDALGetDriverShortName(GDALGetDatasetDriver(hDataset));
    sInfo.nPixels = GDALGetRasterXSize(hDataset);
    sInfo.nLines = GDALGetRasterYSize(hDataset);
    for (int b = 1; b <= GDALGetRasterCount(hDataset); ++b) {
        GDALRasterBandH hBand = GDALGetRasterBand(hDataset, b);
        sInfo.aosBandTypes.emplace_back(GDALGetDataTypeName(GDALGetRasterDataType(hBand)));
        int bHasNoData = FALSE;
        const double dfNoData = GDALGetRasterNoDataValue(hBand, &bHasNoData);
        sInfo.abHasNoData.push_back(bHasNoData != FALSE);
        sInfo.adfNoData.push_back(dfNoData);
    }
    detail::QuietGdalErrors oQuiet;
    sInfo.osCRS = detail::WktOf(GDALGetSpatialRef(hDataset));
    sInfo.bHasGeoTransform = GDALGetGeoTransform(hDataset, sInfo.adfGeoTransform) == CE_None;
    sInfo.bHasRPC = GDALGetMetadata(hDataset, kRpcDomain) != nullptr;
    sInfo.asGCPs = ReadGCPs(hDataset);
    OGRSpatialReferenceH hGcpSRS = GDALGetGCPSpatialRef(hDataset);
    sInfo.osGCPCRS = detail::WktOf(hGcpSRS);
    if (hGcpSRS != nullptr) {
        const char* pszAuthority = OSRGetAuthorityName(hGcpSRS, nullptr);
        const char* pszCode = OSRGetAuthorityCode(hGcpSRS, nullptr);
        if (pszAuthority != nullptr && pszCode != nullptr) {
            sInfo.osGCPCRSCode = std::string(pszAuthority) + ":" + pszCode;
        }
    }
    return sInfo;
}

RFInfo_t* ReadImageRPC(const std::string& osPath) {
    DatasetPtr poDataset = detail::OpenRaster(osPath);
    CSLConstList papszRpc = GDALGetMetadata(poDataset.get(), kRpcDomain);
    if (papszRpc == nullptr) {
        LUMO_GDAL_FAIL(osPath +
                       ": the image carries no rational polynomials (no RPC metadata, .RPB or "
                       "_RPC.TXT file)");
    }
    const std::string osText = MetadataToRpcText(papszRpc);
    return LumoRPCTextToRFInfo(osText.data(), osText.size(), LUMO_RPC_TEXT_TXT, osPath.c_str());
}

void AttachRPC(const std::string& osGeoTiff, const RFInfo_t& sRF) {
    // Through the text writer: an image-space adjustment is folded in as in
    // the text forms, and models without an RPC equivalent are refused.
    std::string osText;
    try {
        osText = LumoRFInfoToRPCText(&sRF, LUMO_RPC_TEXT_TXT);
    } catch (const nova::DataException& e) {
        LUMO_GDAL_FAIL(osGeoTiff + ": " + e.what());
    }
    const std::vector<std::string> aosItems = RpcTextToMetadata(osText);
    DatasetPtr poDataset = detail::OpenRaster(osGeoTiff, true);
    const std::string osDriver = GDALGetDriverShortName(GDALGetDatasetDriver(poDataset.get()));
    if (osDriver != "GTiff") {
        LUMO_GDAL_FAIL(osGeoTiff +
                       ": rational polynomials are attached to GeoTIFF files only (this is " +
                       osDriver + ")");
    }
    std::vector<char*> apszItems;
    apszItems.reserve(aosItems.size() + 1);
    for (const std::string& osItem : aosItems)
        apszItems.push_back(const_cast<char*>(osItem.c_str()));
    apszItems.push_back(nullptr);
    detail::QuietGdalErrors oQuiet;
    if (GDALSetMetadata(poDataset.get(), apszItems.data(), kRpcDomain) != CE_None) {
        LUMO_GDAL_FAIL(osGeoTiff + ": cannot store the rational polynomials" +
                       detail::GdalReason());
    }
    // Closing writes the file; its failures are only reported as errors.
    CPLErrorReset();
    poDataset.reset();
    if (CPLGetLastErrorType() >= CE_Failure) {
        LUMO_GDAL_FAIL(osGeoTiff + ": writing the rational polynomials failed" +
                       detail::GdalReason());
    }
}

}  // namespace gdal
}  // namespace lumo
