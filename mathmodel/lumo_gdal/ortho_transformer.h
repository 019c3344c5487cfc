// The GDAL transformer of an orthorectification: output pixel/line to image
// pixel/line through the math model and the elevation model. Rows of output
// pixels, which is how GDAL's warp kernel asks, are answered from bands of
// rows evaluated with the model object's block operation: exactly on a coarse
// grid, interpolated (with a first-order height correction) where checks
// agree within the error threshold. Other requests are computed exactly.
#pragma once

#include <memory>
#include <mutex>
#include <string>

#include "ortho_frame.h"

namespace lumo {
namespace gdal {
namespace detail {

// What every transformer of one run shares.
class OrthoRun {
  public:
    OrthoRun(std::shared_ptr<const OrthoFrame> poFrame, const double* padfGeoTransform, int nPixels,
             int nLines, double dfTolerance);

    const OrthoFrame& Frame() const { return *mpoFrame; }
    const double* GeoTransform() const { return madfGT; }
    int Pixels() const { return mnPixels; }
    int Lines() const { return mnLines; }
    double Tolerance() const { return mdfTolerance; }

    // Exceptions cannot cross GDAL: the first failure is kept here and
    // raised again once the warp returns.
    void RecordError(const std::string& osMessage) const;
    std::string FirstError() const;

  private:
    std::shared_ptr<const OrthoFrame> mpoFrame;
    double madfGT[6];
    int mnPixels;
    int mnLines;
    double mdfTolerance;
    mutable std::mutex moMutex;
    mutable std::string mosError;
};

// A new GDAL transformer (GDALTransformerFunc OrthoTransform, destroyed by
// GDALDestroyTransformer). GDAL's warp threads each get a clone of their own.
void* CreateOrthoTransformer(std::shared_ptr<const OrthoRun> poRun);

int OrthoTransform(void* pTransformerArg, int bDstToSrc, int nPointCount, double* padfX,
                   double* padfY, double* padfZ, int* panSuccess);

// Lets GDAL clone the transformer for its warp threads; call once before
// warping (Initialize does).
void RegisterOrthoTransformer();

}  // namespace detail
}  // namespace gdal
}  // namespace lumo
