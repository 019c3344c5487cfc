// The geometry of one orthorectification: a math model seen from a ground
// grid in the output CRS, with heights from an elevation model converted to
// the model's vertical datum. Immutable once made, shared by every thread of
// a run; the working storage of each operation belongs to the call.
#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "crs.h"
#include "dem.h"
#include "mathmodel_core.h"

namespace lumo {
namespace gdal {
namespace detail {

// A horizontal transformation between two systems, or none when they agree.
class HorizontalTransform {
  public:
    HorizontalTransform() = default;
    // Throws naming both systems when they cannot be related.
    HorizontalTransform(const nova::ogc::cs::ICRS& oFrom, const nova::ogc::cs::ICRS& oTo);
    bool IsIdentity() const { return !mpoTransform; }
    bool Apply(double dfX, double dfY, double& dfOutX, double& dfOutY) const;

  private:
    std::shared_ptr<nova::ogc::ct::IMathTransform> mpoTransform;
};

class OrthoFrame {
  public:
    // oModel and oDem must outlive the frame. Throws naming the systems that
    // cannot be related, or the geoid grid when it is needed and missing.
    OrthoFrame(const nova::mathmodel::IMathModel& oModel, const nova::dem::IRasterDEM& oDem,
               nova::ogc::CRSPtr poOutput);

    const nova::ogc::cs::ICRS& OutputCRS() const { return *mpoOutput; }
    // The model in output CRS coordinates.
    const nova::mathmodel::IMathModel& Model() const { return *mpoModel; }

    // Height in the model's vertical datum at an output CRS position.
    bool HeightAt(double dfX, double dfY, double& dfZ) const;
    // Heights of a regular grid of nCols x nRows positions from (dfX0, dfY0)
    // in steps (dfStepX, dfStepY), row by row. The smooth parts (reprojection
    // to the elevation model, datum shift) are computed exactly on a coarse
    // lattice and interpolated; the elevation model is sampled at every point.
    void HeightsOfGrid(double dfX0, double dfY0, double dfStepX, double dfStepY, int nCols,
                       int nRows, float* pafZ) const;

    // True when an output CRS position lies in the elevation model's coverage.
    bool InDemCoverage(double dfX, double dfY) const;

    // Exact ground (output CRS) to image, at the elevation model's height.
    bool GroundToImage(double dfX, double dfY, double& dfPixel, double& dfLine) const;
    // Exact image to ground (output CRS): the model's ray met with the
    // elevation model by iterating on the height.
    bool ImageToGround(double dfPixel, double dfLine, double& dfX, double& dfY) const;

  private:
    // Elevation model position and datum shift at an output CRS position.
    bool DemPosition(double dfX, double dfY, double& dfDemX, double& dfDemY, double& dfShift) const;

    const nova::dem::IRasterDEM& moDem;
    nova::ogc::CRSPtr mpoOutput;
    // The model reprojected to the output CRS, when the two systems differ.
    std::unique_ptr<nova::mathmodel::IMathModel> mpoReprojected;
    const nova::mathmodel::IMathModel* mpoModel = nullptr;
    HorizontalTransform moToDem;
    // Datum shift: model height = elevation height + mdfShiftSign * undulation.
    double mdfShiftSign = 0.0;
    HorizontalTransform moToGeographic;
    nova::dem::DEMPtr mpoUndulation;
};

}  // namespace detail
}  // namespace gdal
}  // namespace lumo
