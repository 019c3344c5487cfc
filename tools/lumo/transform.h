// Point transforms through any model the model-file reader knows, by the
// generic dispatch on the model code.
#pragma once

#include <iosfwd>
#include <string>
#include <vector>

#include "model_io.h"
#include "points_io.h"

namespace lumo::cli {

enum class Direction { ToImage, ToGround };

// Kind of point file a direction reads.
PointKind InputKind(Direction direction);

// Columns written for the result: the id and the input coordinates as read,
// then the computed ones.
std::vector<PointColumn> OutputColumns(const PointSet& points, Direction direction);

// Transforms every point in place: ground to image fills pixel and line,
// image to ground (at the point's height) fills x and y. Throws
// nova::DataException naming the point when the model fails or gives a value
// that is not finite.
void TransformPoints(const LoadedModel& model, Direction direction, PointSet& points);

// Reads the point file, transforms it and writes the result to `outPath`, or
// to `out` when `outPath` is empty. An existing output file is replaced only
// once every point has been transformed.
void TransformPointFile(const LoadedModel& model, Direction direction,
                        const std::string& pointsPath, const std::string& outPath,
                        std::ostream& out);

}  // namespace lumo::cli
