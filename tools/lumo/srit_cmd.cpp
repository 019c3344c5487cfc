// The rigorous model in the tool: `lumo fit --model srit`.
#include <cmath>
#include <cstring>
#include <ostream>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"
#include "fit_refine.h"
#include "geosys_option.h"
#include "nova/projection.h"
#include "points_io.h"
#include "progress.h"
#include "segment_io.h"
#include "srit_io.h"

namespace lumo::cli {
namespace {

constexpr std::size_t kSritLeastPoints = 3;

// The model computed from some of the points; null when the computation
// fails.
SritPtr ComputeSrit(const EphemerisSeg_t& segment, ProjInfo_t sProj, int32_t nForm,
                    const ControlArrays& c, const std::vector<char>& use) {
    ControlArrays k = Subset(c, use);
    SegmentPtr psSegment(EphemerisSegDuplicate(&segment));
    SritPtr psModel(SRITAllocate());
    psModel->anAux[SRIT_AUX_FORM] = nForm;
    if (SRITCalculate(psModel.get(), true, psSegment.get(), k.Count(), &sProj, k.pixel.data(),
                      k.line.data(), k.z.data(), k.x.data(), k.y.data()) != 1) {
        return nullptr;
    }
    static_cast<void>(psSegment.release());  // adopted by the model
    return psModel;
}

// The rigorous model fitted to some of the points, mapping every point to
// the image by its exact ground-to-image form.
ImageFit SritImageFit(const EphemerisSeg_t& segment, const ProjInfo_t& sProj, int32_t nForm,
                      const ControlArrays& c) {
    return [&segment, sProj, nForm, &c](const std::vector<char>& use, std::vector<double>& pixel,
                                        std::vector<double>& line) {
        const SritPtr psModel = ComputeSrit(segment, sProj, nForm, c, use);
        if (!psModel) return false;
        pixel.resize(c.pixel.size());
        line.resize(c.pixel.size());
        for (std::size_t i = 0; i < c.pixel.size(); ++i) {
            if (SRITGeo2ImgExact(psModel.get(), c.x[i], c.y[i], c.z[i], &pixel[i], &line[i]) != 1) {
                return false;
            }
        }
        return true;
    };
}

}  // namespace

void AddElevationScaleOption(CLI::App& command, std::string& word) {
    command
        .add_option("--elevation-scale", word,
                    "elevation scale of the rigorous equations (srit): curved (the default; the "
                    "displacement grows with the incidence angle over the curved Earth) or "
                    "classic (the curvature alone, as models of earlier versions)")
        ->check(CLI::IsMember({"curved", "classic"}));
}

void RunSritFit(const PointSet& allGcps, const SritFitOptions& options, const std::string& geosys,
                CommandContext& context) {
    const std::string& segmentPath = options.osSegment;
    const std::string& outputPath = options.osOutput;
    if (segmentPath.empty()) LUMO_CLI_FAIL("--model srit needs --segment");
    SegmentPtr psSegment = ReadSegmentFile(segmentPath);
    const std::string osGeosys =
        !geosys.empty() ? geosys
                        : std::string(psSegment->szGeosys,
                                      strnlen(psSegment->szGeosys, sizeof psSegment->szGeosys));
    if (osGeosys.empty()) {
        LUMO_CLI_FAIL(segmentPath + ": the segment names no projection (szGeosys); give --geosys");
    }
    const ProjInfo_t sProj =
        UserGeosys(osGeosys, !geosys.empty() ? "--geosys" : segmentPath + ": szGeosys");
    if (allGcps.asPoints.size() < kSritLeastPoints) {
        LUMO_CLI_FAIL(allGcps.osSource +
                      ": the rigorous model needs at least 3 control points, found " +
                      std::to_string(allGcps.asPoints.size()));
    }
    const ControlArrays all = ToArrays(allGcps);
    WarnOutsideUTMBand(sProj, all.x, all.y, "lumo fit", context.err);
    const FitResiduals residuals =
        RefineAndMeasure(SritImageFit(*psSegment, sProj, options.nForm, all), allGcps,
                         kSritLeastPoints, options.sRefine);
    ControlArrays k = Subset(all, residuals.use);
    SritPtr psModel;
    {
        const Activity activity("lumo fit: computing the rigorous model from " +
                                std::to_string(k.Count()) + " control points");
        psModel = ComputeSrit(*psSegment, sProj, options.nForm, all, residuals.use);
    }
    const PointSet gcps = KeptPoints(allGcps, residuals);
    if (!psModel) LUMO_CLI_FAIL(gcps.osSource + ": no rigorous model could be computed");
    double dfRmsPixel = 0.0, dfRmsLine = 0.0;
    SRITRMSError(psModel.get(), k.Count(), k.x.data(), k.y.data(), k.z.data(), k.pixel.data(),
                 k.line.data(), dfRmsPixel, dfRmsLine);
    WriteModelFile(outputPath, SritToJson(*psModel));
    context.out << "fitted srit: sensor "
                << std::string(psModel->Sensor, strnlen(psModel->Sensor, SRIT_SENSOR_SIZE))
                << " (code " << psModel->nSensor << ", class " << psModel->nModelClass << ") to "
                << k.Count() << " control points, " << FormWord(options.nForm)
                << " elevation scale\nrms ground->image: pixel " << FormatShort(dfRmsPixel)
                << ", line " << FormatShort(dfRmsLine) << "\n";
    PrintPointResiduals(context.out, allGcps, residuals);
    context.out << "wrote " << outputPath << "\n";
}

}  // namespace lumo::cli
