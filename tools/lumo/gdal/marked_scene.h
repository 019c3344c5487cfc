// The truth for orthoimages: a simulated push-broom image over an elevation
// model with bright marks at known map positions, its rigorous model fitted
// to exact control points, and the measurement of the marks in an orthoimage.
// Used by `lumo demo`, the tests and the benchmarks.
#pragma once

#include <string>
#include <vector>

#include "lumo_sim.h"
#include "lumo_sim_image.h"
#include "nova/dem.h"
#include "srit_io.h"

namespace lumo::cli {

struct MarkedScene {
    std::vector<lumo::sim::GroundMark> asMarks;  // map positions in the scene's UTM zone
    SritPtr psModel;                             // fitted to exact control points
    lumo::sim::RadianceFn fnGround;              // brightness of the ground without marks
};

// Renders the scene's image over oDem (whose CRS must be the scene's UTM
// zone; its heights are taken as the scene's) into osImagePath, a Float32
// GeoTIFF: hill-shaded ground with nMarksPerSide x nMarksPerSide bright marks
// spread over the image. Fits the rigorous model to nGcps exact control
// points. oDem must outlive the result.
MarkedScene MakeMarkedScene(const lumo::sim::SceneParams& sParams,
                            const nova::dem::IRasterDEM& oDem, int nMarksPerSide, int nGcps,
                            const std::string& osImagePath);

struct MarkStats {
    int nMarks = 0;
    int nFound = 0;
    double dfMax = 0.0;  // output pixels
    double dfRms = 0.0;
};

// Distances, in output pixels, between each mark's brightness centroid in an
// orthoimage (first band, same CRS as the marks) and its map position. The
// known ground brightness is taken out first, so only the marks weigh.
MarkStats MeasureMarks(const std::string& osOrtho, const MarkedScene& sScene);

}  // namespace lumo::cli
