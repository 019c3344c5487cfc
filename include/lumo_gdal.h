// The optional GDAL component of lumo (library lumo_gdal, CMake target
// lumo::gdal): elevation models from raster files, rational polynomials and
// control points read from images, and orthorectification of any image with
// any math model on GDAL's warp engine. liblumo itself never depends on GDAL,
// and this header includes no GDAL header. Not part of lumo.h.
//
// Every function reports failures by throwing nova::DataException (or
// nova::ParameterException for a bad argument) whose message names the file
// or the value at fault.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "lumo_rf.h"
#include "nova/dem.h"
#include "nova/mathmodel_core.h"

#if defined(_WIN32)
#if defined(LUMO_GDAL_BUILDING_LIBRARY)
#define LUMO_GDAL_API __declspec(dllexport)
#else
#define LUMO_GDAL_API __declspec(dllimport)
#endif
#else
#define LUMO_GDAL_API __attribute__((visibility("default")))
#endif

namespace lumo {
namespace gdal {

// Registers GDAL's drivers and the elevation kind "gdal" with
// nova::dem::DEMFactory, once. Every function below calls it; safe from any
// thread.
LUMO_GDAL_API void Initialize();

// ---------------------------------------------------------------------------
// Elevation files
// ---------------------------------------------------------------------------

// What the heights of an elevation file are measured from.
enum class HeightReference {
    kFromFile,      // the file's vertical CRS; mean sea level when it declares none
    kMeanSeaLevel,  // the EGM96 geoid (orthometric heights)
    kEllipsoid,     // the ellipsoid of the file's horizontal CRS
};

struct FileDEMOptions {
    HeightReference eHeights = HeightReference::kFromFile;
    int nBand = 1;
    // Memory for height tiles held at once.
    int nCacheMegabytes = 128;
    // Outside the file (and in its voids) answer with the EGM96 geoid, with
    // one warning the first time; otherwise such positions have no height.
    bool bGeoidFallback = true;
};

// An elevation model over any raster GDAL reads (GeoTIFF, a VRT of many
// tiles, ...): bilinear between cell centres, its CRS from the file plus the
// chosen vertical datum, a bounded tile cache, safe for concurrent readers.
// Throws naming the file when it cannot be read, has no or a rotated
// georeferencing, an unknown CRS, or no such band.
LUMO_GDAL_API nova::dem::IRasterDEM* OpenFileDEM(const std::string& osPath,
                                                 const FileDEMOptions& sOptions);

// ---------------------------------------------------------------------------
// Images
// ---------------------------------------------------------------------------

// A control point stored in an image: image position (the top-left corner of
// the first pixel is (0, 0)) and ground position in the image's GCP CRS.
struct ImageGCP {
    std::string osId;
    double dfPixel = 0.0;
    double dfLine = 0.0;
    double dfX = 0.0;
    double dfY = 0.0;
    double dfZ = 0.0;
};

struct ImageInfo {
    std::string osDriver;  // GDAL's short name ("GTiff", "NITF", ...)
    int nPixels = 0;
    int nLines = 0;
    std::vector<std::string> aosBandTypes;  // GDAL type name of every band
    std::vector<bool> abHasNoData;
    std::vector<double> adfNoData;
    std::string osCRS;  // WKT of the georeferencing; empty when there is none
    bool bHasGeoTransform = false;
    double adfGeoTransform[6] = {0, 1, 0, 0, 0, 1};
    bool bHasRPC = false;
    std::vector<ImageGCP> asGCPs;
    std::string osGCPCRS;      // WKT of the control points' CRS
    std::string osGCPCRSCode;  // its "AUTHORITY:CODE" ("EPSG:32631") when it has one
};

// Size, bands, georeferencing, whether it carries rational polynomials, and
// its control points. Throws naming the file when it is not a readable raster.
LUMO_GDAL_API ImageInfo ReadImageInfo(const std::string& osPath);

// The rational polynomials of an image (GeoTIFF or NITF metadata, .RPB or
// _RPC.TXT sidecar) as a new record (release with RFDeallocate), ground
// coordinates in "LONG/LAT D000" and heights above the ellipsoid. Throws
// naming the file when it has none or they are malformed.
LUMO_GDAL_API RFInfo_t* ReadImageRPC(const std::string& osPath);

// Stores a model's rational polynomials in an existing GeoTIFF's RPC
// metadata, so that GDAL-based tools use it. The writing happens on a copy
// beside the image, which replaces it only when all went well: on any
// failure the image is left as it was. Throws when the file is not a
// writable GeoTIFF or the model has no RPC equivalent.
LUMO_GDAL_API void AttachRPC(const std::string& osGeoTiff, const RFInfo_t& sRF);

// ---------------------------------------------------------------------------
// Orthorectification
// ---------------------------------------------------------------------------

enum class Resampling { kNearest, kBilinear, kCubic, kLanczos };

struct OrthoOptions {
    // The output CRS: "EPSG:32631", a PROJ string or WKT. Empty: the model's
    // when it is projected, else the UTM zone of the footprint's centre.
    std::string osOutputCRS;
    // Output pixel size in output CRS units; 0: the model's ground sample
    // distance at the image centre, to three significant digits.
    double dfResolution = 0.0;
    // Output extent (min X, min Y, max X, max Y) in output CRS units; when
    // not given, the image footprint on the elevation model. The grid is
    // aligned on multiples of the resolution either way.
    bool bHasExtent = false;
    double adfExtent[4] = {0, 0, 0, 0};
    Resampling eResampling = Resampling::kBilinear;
    // Value of output pixels that no image pixel covers; when not given, the
    // image's own nodata value, else 0.
    bool bHasNoData = false;
    double dfNoData = 0.0;
    int nThreads = 0;  // 0: every core
    // Largest geometric error allowed to the approximation of the model, in
    // image pixels.
    double dfErrorThreshold = 0.125;
    bool bCloudOptimized = false;  // a cloud-optimised GeoTIFF (with overviews)
    // Called with the fraction done; returning false cancels the run.
    std::function<bool(double)> fnProgress;
};

// The output raster's grid: CRS (WKT), north-up geotransform and size.
struct OrthoGrid {
    std::string osCRS;
    double adfGeoTransform[6] = {0, 1, 0, 0, 0, -1};
    int nPixels = 0;
    int nLines = 0;
};

// The grid that Orthorectify would write with these options. Throws when the
// model's footprint cannot be computed or the options are invalid.
LUMO_GDAL_API OrthoGrid PlanOrthoGrid(const nova::mathmodel::IMathModel& oModel, int nImagePixels,
                                      int nImageLines, const nova::dem::IRasterDEM& oDem,
                                      const OrthoOptions& sOptions);

// Orthorectifies every band of osImage (any GDAL raster, any data type) with
// oModel (image positions as GDAL's: (0, 0) the top-left corner of the first
// pixel) over oDem into a tiled, DEFLATE-compressed GeoTIFF at osOutput. The
// file is written under a temporary name beside osOutput and renamed only
// once complete: a failed or cancelled run leaves nothing at osOutput (an
// existing file there stays as it was). Returns the grid written.
LUMO_GDAL_API OrthoGrid Orthorectify(const std::string& osImage,
                                     const nova::mathmodel::IMathModel& oModel,
                                     const nova::dem::IRasterDEM& oDem, const std::string& osOutput,
                                     const OrthoOptions& sOptions);

}  // namespace gdal
}  // namespace lumo
