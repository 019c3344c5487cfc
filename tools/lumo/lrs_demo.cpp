// `lumo demo`'s orbit part: the bundled AVHRR pass, its nominal model and
// refinement with control points measured on check points, and its sun and
// satellite angles.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <ostream>
#include <string>
#include <vector>

#include "commands.h"
#include "lrs_io.h"
#include "points_io.h"
#include "segment_io.h"

namespace lumo::cli {
namespace {

namespace fs = std::filesystem;

constexpr const char* kSegmentFile = "avhrr_pass.segment.json";
constexpr const char* kGcpFile = "avhrr_pass_gcps.csv";
constexpr const char* kCheckFile = "avhrr_pass_checks.csv";

std::vector<ControlPoint_t> ControlPoints(const std::string& path) {
    std::vector<ControlPoint_t> asPoints;
    for (const PointRecord& p : ReadPointsFile(path, PointKind::ControlPoint).asPoints) {
        asPoints.push_back({p.dfPixel, p.dfLine, p.dfX, p.dfY, p.dfZ});
    }
    return asPoints;
}

// Root-mean-square image error (pixels) of the model on the points.
double Rms(const LRSOrbitModel_t& m, const std::vector<ControlPoint_t>& asPoints) {
    double dfSum = 0.0;
    for (const ControlPoint_t& c : asPoints) {
        double p = 0.0, l = 0.0;
        if (LRSGeodeticToImage(&m, c.dfGroundX, c.dfGroundY, c.dfGroundZ, &p, &l) != 1) {
            return HUGE_VAL;
        }
        dfSum += (p - c.dfImageX) * (p - c.dfImageX) + (l - c.dfImageY) * (l - c.dfImageY);
    }
    return asPoints.empty() ? 0.0 : std::sqrt(dfSum / asPoints.size());
}

}  // namespace

void PrintOrbitDemo(const std::string& examplesDir, std::ostream& out) {
    const std::string segmentPath = (fs::path(examplesDir) / kSegmentFile).string();
    SegmentPtr psSegment = ReadSegmentFile(segmentPath);
    LRSOrbitModel_t m;
    CheckedLrsCall(segmentPath, [&] {
        LRSInitOrbitModel(psSegment.get(), &m);
        LRSSetupCoordinateMapping(&m);
    });
    std::vector<ControlPoint_t> asGcps = ControlPoints((fs::path(examplesDir) / kGcpFile).string());
    const std::vector<ControlPoint_t> asChecks =
        ControlPoints((fs::path(examplesDir) / kCheckFile).string());
    const double dfNominal = Rms(m, asChecks);
    CheckedLrsCall(kGcpFile, [&] {
        LRSRefineOrbitModel(&m, asGcps.data(), static_cast<int>(asGcps.size()));
        LRSSetupCoordinateMapping(&m);
        LRSSetupOrbitModelForAngleGeneration(&m);
    });
    char line[256];
    out << "\norbit model (lrs): AVHRR pass " << kSegmentFile << ", " << m.sSensor.nNumPixels
        << " x " << m.nNumScanLines << ", elements of " << m.nEpochYear << " day "
        << static_cast<int>(1.0 + m.dfEpochSecOfYear / 86400.0) << "\n";
    std::snprintf(line, sizeof line,
                  "  %zu check points: nominal orbit %.3g px rms; refined with %zu control "
                  "points %.3g px rms (roll %.4f deg, along-track %.3f km)\n",
                  asChecks.size(), dfNominal, asGcps.size(), Rms(m, asChecks),
                  m.adfRollPoly[1] * 180.0 / 3.141592653589793,
                  m.adfOrbitCorr[1] * m.adfMeanElements[LRS_ELEM_A]);
    out << line;
    // Angles at the image centre and the ranges over the image.
    double a[LRS_NUM_ANGLE_GRIDS];
    const double dfCentreLine = 0.5 * m.nNumScanLines;
    LRSComputeInterpolatedAngles(&m, 1024.0, dfCentreLine, a, a + 1, a + 2, a + 3, a + 4, 1,
                                 nullptr, nullptr);
    std::snprintf(line, sizeof line,
                  "  angles at the image centre (deg): satellite zenith %.2f azimuth %.2f, "
                  "solar zenith %.2f azimuth %.2f, relative azimuth %.2f\n",
                  a[0], a[1], a[2], a[3], a[4]);
    out << line;
    const std::size_t nNodes = static_cast<std::size_t>(m.nGridCols) * m.nGridRows;
    const auto [satMin, satMax] =
        std::minmax_element(m.apadfAngleGrids[0], m.apadfAngleGrids[0] + nNodes);
    const auto [sunMin, sunMax] =
        std::minmax_element(m.apadfAngleGrids[2], m.apadfAngleGrids[2] + nNodes);
    std::snprintf(line, sizeof line,
                  "  over the image: satellite zenith %.2f to %.2f, solar zenith %.2f to %.2f "
                  "(%d x %d angle grid nodes)\n",
                  *satMin, *satMax, *sunMin, *sunMax, m.nGridCols, m.nGridRows);
    out << line;
}

}  // namespace lumo::cli
