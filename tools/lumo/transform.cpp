#include "transform.h"

#include <ostream>
#include <sstream>

#include "cli_error.h"
#include "commands.h"
#include "progress.h"

namespace lumo::cli {
namespace {

// Maps the ground position (x, y) of the model's system and the point's
// height to the image.
void MapToImage(const LoadedModel& model, RigorousForm form, double x, double y, PointRecord& p) {
    double pixel = 0.0;
    double line = 0.0;
    if (!GroundToImage(model, x, y, p.dfZ, &pixel, &line, form) || !IsPosition(pixel, line)) {
        p.Fail(kFailedToImage, "the model gives no image position for this ground point");
        return;
    }
    p.dfPixel = pixel;
    p.dfLine = line;
}

void MapToGround(const LoadedModel& model, PointRecord& p) {
    double x = 0.0;
    double y = 0.0;
    if (!model.ImageToGround(p.dfPixel, p.dfLine, p.dfZ, &x, &y) || !IsPosition(x, y)) {
        p.Fail(kFailedToGround, "the model gives no ground position for this image point");
        return;
    }
    p.dfX = x;
    p.dfY = y;
}

// The family name for messages ("the rational function model").
std::string ModelName(const LoadedModel& model) {
    for (const ModelFamilyCodec& codec : ModelFamilies()) {
        if (codec.nModelCode == model.nModelCode) return std::string("the ") + codec.pszDescription;
    }
    return "the model";
}

void TransformAll(const LoadedModel& model, const TransformOptions& options, Direction direction,
                  PointSet& points, CommandContext& context) {
    const Georef modelGeoref = ModelGeoref(model);
    const Georef declared = DeclaredGeoref(points, options.sPoints);
    Progress progress("transforming", points.asPoints.size());
    std::size_t done = 0;
    if (direction == Direction::ToImage) {
        const std::vector<GroundXY> ground =
            GroundInModelSystem(points, declared, modelGeoref, kFailedToImage, context.err);
        for (std::size_t i = 0; i < ground.size(); ++i) {
            PointRecord& p = points.asPoints[i];
            if (!p.Failed()) MapToImage(model, options.eForm, ground[i].x, ground[i].y, p);
            progress.Update(++done);
        }
        DeclareGeoref(points, declared.Known() ? declared : modelGeoref);
        return;
    }
    for (PointRecord& p : points.asPoints) {
        MapToGround(model, p);
        progress.Update(++done);
    }
    GroundToDeclaredSystem(points, modelGeoref, declared, kFailedToGround);
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
    } else {
        columns.insert(columns.end(), {PointColumn::Pixel, PointColumn::Line});
        if (points.bHasZ) columns.push_back(PointColumn::Z);
    }
    const std::vector<PointColumn> computed = ComputedColumns(direction);
    columns.insert(columns.end(), computed.begin(), computed.end());
    columns.push_back(PointColumn::Status);
    return columns;
}

std::vector<PointColumn> ComputedColumns(Direction direction) {
    if (direction == Direction::ToImage) return {PointColumn::Pixel, PointColumn::Line};
    return {PointColumn::X, PointColumn::Y};
}

bool SritToImage(const SRITInfo_t& model, double x, double y, double z, double* pixel, double* line,
                 RigorousForm form) {
    if (form == RigorousForm::Exact) return SRITGeo2ImgExact(&model, x, y, z, pixel, line) == 1;
    SRITGeo2Img(&model, x, y, z, pixel, line);
    return IsPosition(*pixel, *line);
}

bool GroundToImage(const LoadedModel& model, double x, double y, double z, double* pixel,
                   double* line, RigorousForm form) {
    if (model.nModelCode == LUMO_CODE_SRIT) {
        return SritToImage(*static_cast<const SRITInfo_t*>(model.poRecord.get()), x, y, z, pixel,
                           line, form);
    }
    return model.GroundToImage(x, y, z, pixel, line) != 0;
}

void TransformPoint(const LoadedModel& model, Direction direction, PointRecord& p,
                    RigorousForm form) {
    if (direction == Direction::ToImage) {
        MapToImage(model, form, p.dfX, p.dfY, p);
    } else {
        MapToGround(model, p);
    }
}

void RunTransform(const TransformOptions& options, const LoadedModel& model,
                  CommandContext& context) {
    const Direction direction =
        options.osToImage.empty() ? Direction::ToGround : Direction::ToImage;
    const std::string& pointsPath =
        direction == Direction::ToImage ? options.osToImage : options.osToGround;
    PointSet points = ReadPointsFile(pointsPath, InputKind(direction));
    ApplyHeights(points, options.sPoints, ModelUsesHeight(model.nModelCode), ModelName(model));
    TransformAll(model, options, direction, points, context);
    std::ostringstream text;
    WritePoints(text, points, OutputColumns(points, direction), ComputedColumns(direction));
    if (options.osOutput.empty()) {
        context.out << text.str();
    } else {
        WriteFileReplacing(options.osOutput, text.str());
    }
    ReportFailedPoints(
        points, options.eForm == RigorousForm::ClosedForm ? "transform --closed-form" : "transform",
        options.sPoints.bKeepGoing, context);
}

}  // namespace lumo::cli
