// The radar model in the tool: `lumo fit --model rtcs`.
#include <cmath>
#include <ostream>
#include <string>
#include <vector>

#include "cli_error.h"
#include "commands.h"
#include "geosys_option.h"
#include "nova/projection.h"
#include "points_io.h"
#include "progress.h"
#include "rtcs_io.h"
#include "segment_io.h"

namespace lumo::cli {
void RunRtcsFit(const PointSet& gcps, const std::string& segmentPath, const std::string& geosys,
                const std::string& heightRef, const std::string& outputPath,
                CommandContext& context) {
    if (segmentPath.empty()) LUMO_CLI_FAIL("--model rtcs needs --segment");
    if (heightRef != "E" && heightRef != "M") {
        LUMO_CLI_FAIL(
            "--model rtcs needs --height-ref E (heights above the ellipsoid) or M "
            "(above mean sea level)");
    }
    if (geosys.empty()) {
        LUMO_CLI_FAIL(
            "--model rtcs needs the control points' georeferencing: --geosys or a "
            "\"# geosys:\" line");
    }
    const ProjInfo_t sProj = UserGeosys(geosys, GeosysWhere(gcps, geosys));
    SegmentPtr psSegment = ReadSegmentFile(segmentPath);
    WarnOutsideUTMBand(sProj, gcps, "lumo fit", context.err);
    std::vector<ControlPoint_t> aoGcps;
    for (const PointRecord& r : gcps.asPoints) {
        aoGcps.push_back({r.dfPixel, r.dfLine, r.dfX, r.dfY, r.dfZ});
    }
    RtcsPtr psModel;
    {
        const Activity activity("lumo fit: generating the radar model from " +
                                std::to_string(aoGcps.size()) + " control points");
        psModel = GenerateRtcs(*psSegment, sProj, heightRef, aoGcps, gcps.osSource);
    }
    // Residuals of the control points through the finished model.
    ProjInfo_t sGeo{};
    Geosys2ProjInfo(&sGeo, "LONG/LAT D000", 0.0, 0.0, 1.0, 1.0);
    double dfSum = 0.0, dfMax = 0.0;
    std::size_t nFailed = 0;
    for (const PointRecord& r : gcps.asPoints) {
        double dfLon = r.dfX, dfLat = r.dfY, dfPixel = 0.0, dfLine = 0.0;
        if (GCTPTransform(&sProj, r.dfX, r.dfY, &sGeo, &dfLon, &dfLat) != 0 ||
            RTCSGeo2Img(psModel.get(), dfLon, dfLat, r.dfZ, &dfPixel, &dfLine) != 1) {
            ++nFailed;
            continue;
        }
        const double e = std::hypot(dfPixel - r.dfPixel, dfLine - r.dfLine);
        dfSum += e * e;
        dfMax = std::max(dfMax, e);
    }
    const std::size_t nDone = gcps.asPoints.size() - nFailed;
    // One text line per line of the segment's table, as in segment files.
    WriteFileReplacing(
        outputPath, FormatSegmentJson(nlohmann::ordered_json::parse(RtcsToJson(*psModel).dump())));
    context.out << "fitted rtcs: " << psSegment->nNumPixels << " x " << psSegment->nNumLines
                << " radar image, " << gcps.asPoints.size() << " control points, heights above "
                << (heightRef == "E" ? "the ellipsoid" : "mean sea level") << "\n"
                << "control point residuals ground->image: rms "
                << FormatShort(nDone ? std::sqrt(dfSum / nDone) : 0.0) << " px, max "
                << FormatShort(dfMax) << " px\n"
                << (psModel->poRpcModel != nullptr
                        ? "rational polynomial model fitted to the model's geometry\n"
                        : "no rational polynomial model: the model answers from its own "
                          "geometry\n")
                << "wrote " << outputPath << "\n";
}

}  // namespace lumo::cli
