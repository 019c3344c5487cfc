// What an image file says about itself: size, bands, georeferencing, control
// points and rational polynomials, read through GDAL; and rational
// polynomials written into a GeoTIFF.

#include <cctype>
#include <filesystem>
#include <map>
#include <optional>
#include <sstream>
#include <string>
#include <system_error>
#include <vector>

#include <unistd.h>

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

namespace {

// A working copy of an image beside it (with its .aux.xml sidecar, which may
// hold GDAL's own metadata), removed on every path unless it replaces the
// image: a failure while GDAL writes leaves the image as it was.
class WorkingCopy {
  public:
    explicit WorkingCopy(const std::string& osImage)
        : oImage_(ImagePath(osImage)),
          oCopy_(oImage_.string() + ".lumo-" + std::to_string(getpid()) + ".tmp") {
        std::error_code oError;
        std::filesystem::copy_file(oImage_, oCopy_,
                                   std::filesystem::copy_options::overwrite_existing, oError);
        if (!oError && std::filesystem::exists(Aux(oImage_), oError)) {
            std::filesystem::copy_file(Aux(oImage_), Aux(oCopy_),
                                       std::filesystem::copy_options::overwrite_existing, oError);
        }
        if (oError) {
            Remove();
            LUMO_GDAL_FAIL(osImage + ": cannot make a working copy beside it (" + oError.message() +
                           ")");
        }
    }
    WorkingCopy(const WorkingCopy&) = delete;
    WorkingCopy& operator=(const WorkingCopy&) = delete;
    ~WorkingCopy() { Remove(); }

    std::string Path() const { return oCopy_.string(); }

    // Puts the copy in the image's place (a rename within one folder
    // replaces the image at once), then its sidecar when GDAL wrote one.
    void Replace(const std::string& osImage) {
        std::error_code oError;
        std::filesystem::rename(oCopy_, oImage_, oError);
        if (!oError && std::filesystem::exists(Aux(oCopy_), oError)) {
            std::filesystem::rename(Aux(oCopy_), Aux(oImage_), oError);
        }
        if (oError) LUMO_GDAL_FAIL(osImage + ": cannot replace it (" + oError.message() + ")");
    }

  private:
    void Remove() const {
        std::error_code oError;
        std::filesystem::remove(oCopy_, oError);
        std::filesystem::remove(Aux(oCopy_), oError);
    }
    // The file itself when the path is a link, so the link keeps pointing at it.
    static std::filesystem::path ImagePath(const std::string& osImage) {
        std::error_code oError;
        std::filesystem::path oPath = std::filesystem::canonical(osImage, oError);
        return oError ? std::filesystem::path(osImage) : oPath;
    }
    static std::filesystem::path Aux(const std::filesystem::path& oPath) {
        return std::filesystem::path(oPath.string() + ".aux.xml");
    }

    std::filesystem::path oImage_;
    std::filesystem::path oCopy_;
};

}  // namespace

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
    {
        DatasetPtr poImage = detail::OpenRaster(osGeoTiff);
        const std::string osDriver = GDALGetDriverShortName(GDALGetDatasetDriver(poImage.get()));
        if (osDriver != "GTiff") {
            LUMO_GDAL_FAIL(osGeoTiff +
                           ": rational polynomials are attached to GeoTIFF files only (this is " +
                           osDriver + ")");
        }
    }
    // GDAL's virtual files (/vsimem/...) are written in place: they are not
    // files of ours to copy.
    std::optional<WorkingCopy> oCopy;
    if (osGeoTiff.rfind("/vsi", 0) != 0) oCopy.emplace(osGeoTiff);
    DatasetPtr poDataset = detail::OpenRaster(oCopy ? oCopy->Path() : osGeoTiff, true);
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
    // Closing writes the copy; its failures are only reported as errors.
    CPLErrorReset();
    poDataset.reset();
    if (CPLGetLastErrorType() >= CE_Failure) {
        LUMO_GDAL_FAIL(osGeoTiff + ": writing the rational polynomials failed" +
                       detail::GdalReason());
    }
    if (oCopy) oCopy->Replace(osGeoTiff);
}

}  // namespace gdal
}  // namespace lumo
