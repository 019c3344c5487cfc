// Image rendering for the scene simulator: every pixel of a simulated
// push-broom image sees the terrain where its line of sight meets it, and
// takes the ground's brightness there. With bright marks at known map
// positions, orthoimages made from such images can be checked against the
// truth.
#pragma once

#include <functional>
#include <vector>

#include "lumo_sim.h"

namespace lumo::sim {

// Terrain height (above the ellipsoid, as the scene's heights) at a UTM
// position of the scene's zone; false where it is unknown.
using TerrainFn = std::function<bool(double dfX, double dfY, double* pdfZ)>;
// Ground brightness at a UTM position.
using RadianceFn = std::function<double(double dfX, double dfY)>;

// The terrain point seen at an image position: the line of sight met with the
// terrain by iterating on the height from dfStartZ. False when the terrain is
// unknown there or the iteration does not settle.
bool SeeTerrain(const Scene& oScene, double dfPixel, double dfLine, const TerrainFn& fnTerrain,
                double dfStartZ, SimPoint* psOut);

// The image, row by row (index line * nPixels + pixel): each pixel takes the
// brightness of the terrain point its centre sees; NaN where it sees none.
std::vector<float> RenderImage(const Scene& oScene, const TerrainFn& fnTerrain,
                               const RadianceFn& fnRadiance);

// A plain ground with Gaussian bright marks of standard deviation dfSigma
// (metres) at the given UTM positions.
struct GroundMark {
    double dfX;
    double dfY;
};
RadianceFn MarkedGround(std::vector<GroundMark> asMarks, double dfSigma, double dfBackground,
                        double dfPeak);

}  // namespace lumo::sim
