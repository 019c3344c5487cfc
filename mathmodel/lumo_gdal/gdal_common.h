// Shared plumbing of the GDAL component: driver registration, owned GDAL
// handles, GDAL's error messages turned into exceptions that name the file,
// and coordinate systems read from GDAL.
#pragma once

#include <memory>
#include <string>

#include <gdal.h>
#include <ogr_srs_api.h>

#include "crs.h"
#include "runtime.h"

// Throws nova::DataException with the message, from the calling site.
#define LUMO_GDAL_FAIL(message) throw nova::DataException((message), __FILE__, __func__, __LINE__)

namespace lumo {
namespace gdal {
namespace detail {

struct DatasetCloser {
    void operator()(void* hDataset) const {
        if (hDataset != nullptr) GDALClose(static_cast<GDALDatasetH>(hDataset));
    }
};
using DatasetPtr = std::unique_ptr<void, DatasetCloser>;

// GDAL's last error message of this thread, as " (GDAL: ...)" or "".
std::string GdalReason();

// Keeps GDAL's error reports off the console while it lives (they are read
// back with GdalReason instead); the previous handler returns afterwards.
class QuietGdalErrors {
  public:
    QuietGdalErrors();
    ~QuietGdalErrors();
    QuietGdalErrors(const QuietGdalErrors&) = delete;
    QuietGdalErrors& operator=(const QuietGdalErrors&) = delete;
};

// Opens a raster read-only (or for update). Throws naming the path when it
// does not exist or GDAL cannot read it as a raster.
DatasetPtr OpenRaster(const std::string& osPath, bool bUpdate = false);

// A host CRS for a GDAL spatial reference, or null when hSRS is null.
// Throws naming osSource when the reference cannot be expressed.
nova::ogc::CRSPtr CRSFromGdal(OGRSpatialReferenceH hSRS, const std::string& osSource);

// The WKT (2019) of a spatial reference; empty for null.
std::string WktOf(OGRSpatialReferenceH hSRS);

}  // namespace detail
}  // namespace gdal
}  // namespace lumo
