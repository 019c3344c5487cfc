// The rigorous model in the tool: `lumo fit --model srit`.
#include <cmath>
#include <cstring>
#include <ostream>
#include <string>
#include <vector>

#include "cli_error.h"
#include "commands.h"
#include "fit_refine.h"
#include "nova/projection.h"
#include "points_io.h"
#include "segment_io.h"
#include "srit_io.h"

namespace lumo::cli {
namespace {

constexpr std::size_t kSritLeastPoints = 3;

// Control points as the parallel arrays of the computation.
struct SritControl {
    std::vector<double> p, l, x, y, z;
};

// The model computed from some of the points; null when the computation
// fails.
SritPtr ComputeSrit(const EphemerisSeg_t& segment, ProjInfo_t sProj, const SritControl& c,
                    const std::vector<char>& use) {
    std::vector<double> p = Subset(c.p, use), l = Subset(c.l, use), x = Subset(c.x, use);
    std::vector<double> y = Subset(c.y, use), z = Subset(c.z, use);
    SegmentPtr psSegment(EphemerisSegDuplicate(&segment));
    SritPtr psModel(SRITAllocate());
    if (SRITCalculate(psModel.get(), true, psSegment.get(), static_cast<int>(p.size()), &sProj,
                      p.data(), l.data(), z.data(), x.data(), y.data()) != 1) {
        return nullptr;
    }
    static_cast<void>(psSegment.release());  // adopted by the model
    return psModel;
}

// The rigorous model fitted to some of the points, mapping every point to
// the image by its exact ground-to-image form.
ImageFit SritImageFit(const EphemerisSeg_t& segment, const ProjInfo_t& sProj,
                      const SritControl& c) {
    return [&segment, sProj, &c](const std::vector<char>& use, std::vector<double>& pixel,
                                 std::vector<double>& line) {
        const SritPtr psModel = ComputeSrit(segment, sProj, c, use);
        if (!psModel) return false;
        pixel.resize(c.p.size());
        line.resize(c.p.size());
        for (std::size_t i = 0; i < c.p.size(); ++i) {
            if (SRITGeo2ImgExact(psModel.get(), c.x[i], c.y[i], c.z[i], &pixel[i], &line[i]) != 1) {
                return false;
            }
        }
        return true;
    };
}

}  // namespace

void RunSritFit(const PointSet& allGcps, const std::string& segmentPath, const std::string& geosys,
                const std::string& outputPath, const RefineOptions& refine,
                CommandContext& context) {
    if (segmentPath.empty()) LUMO_CLI_FAIL("--model srit needs --segment");
    SegmentPtr psSegment = ReadSegmentFile(segmentPath);
    const std::string osGeosys =
        !geosys.empty() ? geosys
                        : std::string(psSegment->szGeosys,
                                      strnlen(psSegment->szGeosys, sizeof psSegment->szGeosys));
    if (osGeosys.empty()) {
        LUMO_CLI_FAIL(segmentPath + ": the segment names no projection (szGeosys); give --geosys");
    }
    ProjInfo_t sProj{};
    if (Geosys2ProjInfo(&sProj, osGeosys.c_str(), 0.0, 0.0, 1.0, 1.0) < 0) {
        LUMO_CLI_FAIL("projection " + Quoted(osGeosys) + " is not a known georeferencing text");
    }
    if (allGcps.asPoints.size() < kSritLeastPoints) {
        LUMO_CLI_FAIL(allGcps.osSource +
                      ": the rigorous model needs at least 3 control points, found " +
                      std::to_string(allGcps.asPoints.size()));
    }
    SritControl all;
    for (const PointRecord& r : allGcps.asPoints) {
        all.p.push_back(r.dfPixel);
        all.l.push_back(r.dfLine);
        all.x.push_back(r.dfX);
        all.y.push_back(r.dfY);
        all.z.push_back(r.dfZ);
    }
    const FitResiduals residuals =
        RefineAndMeasure(SritImageFit(*psSegment, sProj, all), allGcps, kSritLeastPoints, refine);
    const PointSet gcps = KeptPoints(allGcps, residuals);
    SritPtr psModel = ComputeSrit(*psSegment, sProj, all, residuals.use);
    if (!psModel) LUMO_CLI_FAIL(gcps.osSource + ": no rigorous model could be computed");
    const std::vector<double> p = Subset(all.p, residuals.use), l = Subset(all.l, residuals.use);
    const std::vector<double> x = Subset(all.x, residuals.use), y = Subset(all.y, residuals.use);
    const std::vector<double> z = Subset(all.z, residuals.use);
    double dfRmsPixel = 0.0, dfRmsLine = 0.0;
    SRITRMSError(psModel.get(), static_cast<int>(p.size()), x.data(), y.data(), z.data(), p.data(),
                 l.data(), dfRmsPixel, dfRmsLine);
    WriteModelFile(outputPath, SritToJson(*psModel));
    context.out << "fitted srit: sensor "
                << std::string(psModel->Sensor, strnlen(psModel->Sensor, SRIT_SENSOR_SIZE))
                << " (code " << psModel->nSensor << ", class " << psModel->nModelClass << ") to "
                << p.size() << " control points\nrms ground->image: pixel " << FormatShort(dfRmsPixel)
                << ", line " << FormatShort(dfRmsLine) << "\n";
    PrintPointResiduals(context.out, allGcps, residuals);
    context.out << "wrote " << outputPath << "\n";
}

}  // namespace lumo::cli
