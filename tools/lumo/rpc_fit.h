// Rational polynomials fitted to any model: the terrain-independent fit of
// `lumo rpc --fit`, through the host's rational polynomial fit, checked on
// an independent grid.
#pragma once

#include "lumo.h"
#include "nova/crs.h"
#include "nova/dem.h"
#include "rf_io.h"

namespace lumo::cli {

// Maps image positions at heights above the WGS 84 ellipsoid to longitude
// and latitude through a model, whatever its CRS and vertical datum (heights
// above mean sea level are converted through the EGM96 geoid). The model must
// outlive the mapper. Throws naming what is missing.
class EllipsoidalGround {
  public:
    explicit EllipsoidalGround(const nova::mathmodel::IMathModel& oModel);
    bool Map(double dfPixel, double dfLine, double dfHeight, double& dfLon, double& dfLat) const;

  private:
    const nova::mathmodel::IMathModel& moModel;
    nova::dem::DEMPtr mpoGeoid;
    nova::ogc::MathTransformPtr mpoToGeographic;
    bool mbOrthometric = false;
};

// Largest and root-mean-square image distances, pixels.
struct RpcFitErrors {
    int nPoints = 0;
    double dfMax = 0.0;
    double dfRms = 0.0;
};

struct RpcFit {
    RFPtr psRF;           // longitude/latitude, heights above the ellipsoid
    RpcFitErrors sFit;    // on the fitted grid
    RpcFitErrors sCheck;  // on an independent grid between the fitted nodes
};

// Fits rational polynomials to oModel over its nPixels x nLines image and
// heights dfMinHeight..dfMaxHeight above the WGS 84 ellipsoid: a grid of
// image positions on several heights is mapped to the ground by the model
// (heights converted to the model's vertical datum through the EGM96 geoid),
// fitted, and the fitted record is checked against the model on a second
// grid half a cell off the first. Image positions keep the model's
// convention (the record's half-pixel shift makes up for the rational
// polynomials' centre-of-pixel origin). Throws naming what failed.
RpcFit FitRpcToModel(const nova::mathmodel::IMathModel& oModel, int nPixels, int nLines,
                     double dfMinHeight, double dfMaxHeight);

}  // namespace lumo::cli
