// The rigorous model in the tool: `lumo fit --model srit`.
#include <cmath>
#include <cstring>
#include <ostream>
#include <string>
#include <vector>

#include "cli_error.h"
#include "commands.h"
#include "nova/projection.h"
#include "points_io.h"
#include "segment_io.h"
#include "srit_io.h"

namespace lumo::cli {
void RunSritFit(const PointSet& gcps, const std::string& segmentPath, const std::string& geosys,
                const std::string& outputPath, CommandContext& context) {
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
    if (gcps.asPoints.size() < 3) {
        LUMO_CLI_FAIL(gcps.osSource +
                      ": the rigorous model needs at least 3 control points, found " +
                      std::to_string(gcps.asPoints.size()));
    }
    std::vector<double> p, l, x, y, z;
    for (const PointRecord& r : gcps.asPoints) {
        p.push_back(r.dfPixel);
        l.push_back(r.dfLine);
        x.push_back(r.dfX);
        y.push_back(r.dfY);
        z.push_back(r.dfZ);
    }
    SritPtr psModel(SRITAllocate());
    if (SRITCalculate(psModel.get(), true, psSegment.get(), static_cast<int>(p.size()), &sProj,
                      p.data(), l.data(), z.data(), x.data(), y.data()) != 1) {
        LUMO_CLI_FAIL(gcps.osSource + ": no rigorous model could be computed");
    }
    static_cast<void>(psSegment.release());  // adopted by the model
    double dfRmsPixel = 0.0, dfRmsLine = 0.0;
    SRITRMSError(psModel.get(), static_cast<int>(p.size()), x.data(), y.data(), z.data(), p.data(),
                 l.data(), dfRmsPixel, dfRmsLine);
    WriteModelFile(outputPath, SritToJson(*psModel));
    context.out << "fitted srit: sensor "
                << std::string(psModel->Sensor, strnlen(psModel->Sensor, SRIT_SENSOR_SIZE))
                << " (code " << psModel->nSensor << ", class " << psModel->nModelClass << ") to "
                << p.size() << " control points\nrms ground->image: pixel "
                << FormatShort(dfRmsPixel) << ", line " << FormatShort(dfRmsLine) << "\nwrote "
                << outputPath << "\n";
}

}  // namespace lumo::cli
