// Control points for the fits: a CSV point file, or (with the GDAL
// component) the control points stored in an image.
#pragma once

#include <string>

#include "points_io.h"

namespace lumo::cli {

struct ControlPointSource {
    // From an image, sPoints.osGeosys is the georeferencing text of the
    // points' CRS when it is WGS 84 longitude and latitude or a WGS 84 UTM
    // zone, and empty otherwise.
    PointSet sPoints;
    int nPixels = -1;  // the image's size, when read from an image
    int nLines = -1;
};

// Reads the control points of a CSV file, or of a raster that carries
// control points. Throws naming the file when it holds none or cannot be
// read.
ControlPointSource ReadControlPointSource(const std::string& path);

}  // namespace lumo::cli
