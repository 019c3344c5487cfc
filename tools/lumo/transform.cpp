#include "transform.h"

#include <cmath>
#include <ostream>
#include <sstream>

#include "cli_error.h"
#include "progress.h"

namespace lumo::cli {
namespace {

[[noreturn]] void FailPoint(const PointSet& points, const PointRecord& p, const char* what) {
    std::string name = points.osSource + ":" + std::to_string(p.nSourceLine);
    if (!p.osId.empty()) name += " (id " + Quoted(p.osId) + ")";
    LUMO_CLI_FAIL(name + ": " + what);
}

void TransformOne(const LoadedModel& model, Direction direction, const PointSet& points,
                  PointRecord& p) {
    void* record = model.poRecord.get();
    if (direction == Direction::ToImage) {
        double pixel = 0.0;
        double line = 0.0;
        if (!GenGeo2Img(model.nModelCode, record, p.dfX, p.dfY, p.dfZ, &pixel, &line)) {
            FailPoint(points, p, "the model cannot map this ground point to the image");
        }
        if (!std::isfinite(pixel) || !std::isfinite(line)) {
            FailPoint(points, p, "the image position is not finite (input out of range)");
        }
        p.dfPixel = pixel;
        p.dfLine = line;
    } else {
        double x = 0.0;
        double y = 0.0;
        if (!GenImg2Geo(model.nModelCode, record, p.dfPixel, p.dfLine, p.dfZ, &x, &y)) {
            FailPoint(points, p, "the model cannot map this image point to the ground");
        }
        if (!std::isfinite(x) || !std::isfinite(y)) {
            FailPoint(points, p, "the ground position is not finite (input out of range)");
        }
        p.dfX = x;
        p.dfY = y;
    }
}

}  // namespace

PointKind InputKind(Direction direction) {
    return direction == Direction::ToImage ? PointKind::Ground : PointKind::Image;
}

std::vector<PointColumn> OutputColumns(const PointSet& points, Direction direction) {
    std::vector<PointColumn> columns;
    if (points.bHasId) columns.push_back(PointColumn::Id);
    if (direction == Direction::ToImage) {
        columns.insert(columns.end(), {PointColumn::X, PointColumn::Y});
        if (points.bHasZ) columns.push_back(PointColumn::Z);
        columns.insert(columns.end(), {PointColumn::Pixel, PointColumn::Line});
    } else {
        columns.insert(columns.end(), {PointColumn::Pixel, PointColumn::Line});
        if (points.bHasZ) columns.push_back(PointColumn::Z);
        columns.insert(columns.end(), {PointColumn::X, PointColumn::Y});
    }
    return columns;
}

void TransformPoints(const LoadedModel& model, Direction direction, PointSet& points) {
    Progress progress("transforming", points.asPoints.size());
    std::size_t done = 0;
    for (PointRecord& p : points.asPoints) {
        TransformOne(model, direction, points, p);
        progress.Update(++done);
    }
}

void TransformPointFile(const LoadedModel& model, Direction direction,
                        const std::string& pointsPath, const std::string& outPath,
                        std::ostream& out) {
    PointSet points = ReadPointsFile(pointsPath, InputKind(direction));
    TransformPoints(model, direction, points);
    const std::vector<PointColumn> columns = OutputColumns(points, direction);
    if (outPath.empty()) {
        WritePoints(out, points, columns);
        return;
    }
    std::ostringstream text;
    WritePoints(text, points, columns);
    WriteFileReplacing(outPath, text.str());
}

}  // namespace lumo::cli
