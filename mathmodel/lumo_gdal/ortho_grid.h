// Output grids of orthorectification: the output CRS read from a user's
// text, and the grid planned from the options and the model's footprint.
#pragma once

#include <string>

#include "crs.h"
#include "lumo_gdal.h"

namespace lumo {
namespace gdal {
namespace detail {

// "EPSG:32631", "32631", a PROJ string (with or without +type=crs) or WKT.
// Throws naming the text when it is not a geographic or projected system.
nova::ogc::CRSPtr ParseOutputCRS(const std::string& osText);

// The grid of PlanOrthoGrid, with the output CRS object in poOutput.
OrthoGrid PlanGrid(const nova::mathmodel::IMathModel& oModel, int nImagePixels, int nImageLines,
                   const nova::dem::IRasterDEM& oDem, const OrthoOptions& sOptions,
                   nova::ogc::CRSPtr& poOutput);

}  // namespace detail
}  // namespace gdal
}  // namespace lumo
