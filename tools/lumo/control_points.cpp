#include "control_points.h"

#include <cstdio>
#include <string>

#include "cli_error.h"
#include "nova/projection.h"

#ifdef LUMO_HAVE_GDAL
#include "lumo_gdal.h"
#endif

namespace lumo::cli {
namespace {

#ifdef LUMO_HAVE_GDAL
// The georeferencing text of WGS 84 geographic and UTM systems; empty for
// others. A southern UTM zone takes the latitude band of the points' centre.
std::string GeosysOfCode(const std::string& code, const PointSet& points) {
    if (code == "EPSG:4326") return "LONG/LAT D000";
    int nCode = 0;
    if (std::sscanf(code.c_str(), "EPSG:%d", &nCode) != 1) return std::string();
    const int nZone = nCode % 100;
    const bool bNorth = nCode / 100 == 326;
    if ((!bNorth && nCode / 100 != 327) || nZone < 1 || nZone > 60) return std::string();
    if (bNorth) return "UTM " + std::to_string(nZone) + " D000";
    double dfX = 0.0, dfY = 0.0;
    for (const PointRecord& p : points.asPoints) {
        dfX += p.dfX / points.asPoints.size();
        dfY += p.dfY / points.asPoints.size();
    }
    std::string from = "UTM " + std::to_string(nZone) + " M D000";
    std::string to = "LONG/LAT D000";
    double dfLon = 0.0, dfLat = 0.0;
    int nFoundZone = 0;
    char cBand = 'M';
    if (GCTPSimpleTransform(&from[0], dfX, dfY, &to[0], &dfLon, &dfLat) != 0 ||
        UTMZone(dfLon, dfLat, &nFoundZone, &cBand) != 0 || cBand > 'M') {
        cBand = 'M';
    }
    return "UTM " + std::to_string(nZone) + " " + cBand + " D000";
}

bool ReadImageControlPoints(const std::string& path, ControlPointSource& source) {
    lumo::gdal::ImageInfo info;
    try {
        info = lumo::gdal::ReadImageInfo(path);
    } catch (const nova::Exception&) {
        return false;  // not a raster either
    }
    if (info.asGCPs.empty()) LUMO_CLI_FAIL(path + ": the image carries no control points");
    source.sPoints.osSource = path;
    source.sPoints.bHasId = true;
    source.sPoints.bHasZ = true;
    for (const lumo::gdal::ImageGCP& gcp : info.asGCPs) {
        PointRecord p;
        p.osId = gcp.osId;
        p.dfPixel = gcp.dfPixel;
        p.dfLine = gcp.dfLine;
        p.dfX = gcp.dfX;
        p.dfY = gcp.dfY;
        p.dfZ = gcp.dfZ;
        source.sPoints.asPoints.push_back(p);
    }
    source.sPoints.osGeosys = GeosysOfCode(info.osGCPCRSCode, source.sPoints);
    source.nPixels = info.nPixels;
    source.nLines = info.nLines;
    return true;
}
#endif

}  // namespace

ControlPointSource ReadControlPointSource(const std::string& path) {
    ControlPointSource source;
    try {
        source.sPoints = ReadPointsFile(path, PointKind::ControlPoint);
        return source;
    } catch (const nova::Exception&) {
        // Some point files are rasters to GDAL (its XYZ driver), so a file
        // that reads as points is points; only one that does not may be an
        // image, and otherwise the point reader's message stands.
#ifdef LUMO_HAVE_GDAL
        if (ReadImageControlPoints(path, source)) return source;
#endif
        throw;
    }
}

}  // namespace lumo::cli
