// Point transforms through any model the model-file reader knows, by the
// generic dispatch on the model code.
#pragma once

#include <string>
#include <vector>

#include "model_io.h"
#include "points_io.h"

namespace lumo::cli {

struct CommandContext;
struct TransformOptions;

enum class Direction { ToImage, ToGround };

// How a rigorous model maps ground to image: as the exact inverse of its
// image-to-ground equations (the default: round trips close), or by its
// closed form (SRITGeo2Img, which off nadir misses the equations by tenths
// of a pixel). Other families have one form.
enum class RigorousForm { Exact, ClosedForm };

// Ground (x, y in the model's system, z) to image; false when the model
// gives no image position.
bool GroundToImage(const LoadedModel& model, double x, double y, double z, double* pixel,
                   double* line, RigorousForm form = RigorousForm::Exact);
bool SritToImage(const SRITInfo_t& model, double x, double y, double z, double* pixel, double* line,
                 RigorousForm form = RigorousForm::Exact);

// Kind of point file a direction reads.
PointKind InputKind(Direction direction);

// Columns written for the result: the id and the input coordinates as read,
// then the computed ones and the status.
std::vector<PointColumn> OutputColumns(const PointSet& points, Direction direction);
// The columns a direction computes, left empty for a failed point.
std::vector<PointColumn> ComputedColumns(Direction direction);

// Maps one point in place (ground coordinates in the model's system): ground
// to image fills pixel and line, image to ground (at the point's height)
// fills x and y. A point the model cannot map, or maps to no real position,
// is failed instead.
void TransformPoint(const LoadedModel& model, Direction direction, PointRecord& p,
                    RigorousForm form = RigorousForm::Exact);

// Reads the point file of `options`, transforms it and writes the result to
// the output file (replaced only once complete), or to standard output.
// Failed points are written with empty fields and counted on standard error.
void RunTransform(const TransformOptions& options, const LoadedModel& model,
                  CommandContext& context);

}  // namespace lumo::cli
