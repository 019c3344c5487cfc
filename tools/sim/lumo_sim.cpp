// Scene simulator: orbit, sensor frame, exact image/ground mapping and the
// ephemeris segment filled from them.
#include "lumo_sim.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <random>
#include <stdexcept>
#include <string>

#include "lumo_ephemeris.h"
#include "runtime.h"
#include "sim_math.h"

namespace lumo::sim {

Ecef GeodeticToEcef(double dfLat, double dfLon, double dfHeight) {
    const double s = std::sin(dfLat);
    const double n = kSemiMajor / std::sqrt(1.0 - kEcc2 * s * s);
    const double r = (n + dfHeight) * std::cos(dfLat);
    return {r * std::cos(dfLon), r * std::sin(dfLon), (n * (1.0 - kEcc2) + dfHeight) * s};
}

void EcefToGeodetic(const Ecef& sPoint, double* pdfLat, double* pdfLon, double* pdfHeight) {
    const double p = std::hypot(sPoint.x, sPoint.y);
    double dfLat = std::atan2(sPoint.z, p * (1.0 - kEcc2));
    double dfHeight = 0.0;
    // Fixed-point iteration on the latitude; converges to machine precision
    // within a few rounds for points near the Earth's surface and in orbit.
    for (int i = 0; i < 30; ++i) {
        const double s = std::sin(dfLat);
        const double n = kSemiMajor / std::sqrt(1.0 - kEcc2 * s * s);
        dfHeight = std::abs(std::cos(dfLat)) > 1e-3 ? p / std::cos(dfLat) - n
                                                    : sPoint.z / s - n * (1.0 - kEcc2);
        const double dfNext = std::atan2(sPoint.z, p * (1.0 - kEcc2 * n / (n + dfHeight)));
        const bool bDone = std::abs(dfNext - dfLat) < 1e-15;
        dfLat = dfNext;
        if (bDone) break;
    }
    *pdfLat = dfLat;
    *pdfLon = std::atan2(sPoint.y, sPoint.x);
    *pdfHeight = dfHeight;
}

Scene::Scene(const SceneParams& sParams) : m_sParams(sParams) {
    const SceneParams& p = m_sParams;
    Require(std::isfinite(p.dfOrbitRadius) && p.dfOrbitRadius > kSemiMajor + 100000.0,
            "orbit radius", p.dfOrbitRadius, "must lie above the atmosphere");
    Require(std::isfinite(p.dfInclinationDeg) && p.dfInclinationDeg > 0.0 &&
                p.dfInclinationDeg < 180.0 && std::abs(p.dfInclinationDeg - 90.0) > 1e-6,
            "inclination", p.dfInclinationDeg, "must lie in (0, 180) degrees, not 90");
    const double dfSinI = std::sin(p.dfInclinationDeg * kDeg);
    Require(std::isfinite(p.dfNadirLatitudeDeg) && std::abs(p.dfNadirLatitudeDeg) < 85.0,
            "nadir latitude", p.dfNadirLatitudeDeg, "must lie within +-85 degrees");
    const double dfGeocLat = std::atan((1.0 - kEcc2) * std::tan(p.dfNadirLatitudeDeg * kDeg));
    Require(std::abs(std::sin(dfGeocLat)) < dfSinI * (1.0 - 1e-6), "nadir latitude",
            p.dfNadirLatitudeDeg, "is not reached by an orbit of this inclination");
    Require(std::isfinite(p.dfNadirLongitudeDeg) && std::abs(p.dfNadirLongitudeDeg) <= 180.0,
            "nadir longitude", p.dfNadirLongitudeDeg, "must lie within +-180 degrees");
    Require(std::isfinite(p.dfRollDeg) && std::abs(p.dfRollDeg) <= 45.0, "roll", p.dfRollDeg,
            "must lie within +-45 degrees");
    Require(std::isfinite(p.dfPitchDeg) && std::abs(p.dfPitchDeg) <= 45.0, "pitch", p.dfPitchDeg,
            "must lie within +-45 degrees");
    Require(std::isfinite(p.dfIFOV) && p.dfIFOV > 0.0 && p.dfIFOV < 1e-2, "IFOV", p.dfIFOV,
            "must lie in (0, 0.01) radians");
    Require(std::isfinite(p.dfLineInterval) && p.dfLineInterval >= 0.0 && p.dfLineInterval < 1.0,
            "line interval", p.dfLineInterval, "must lie in [0, 1) seconds");
    Require(p.nPixels >= 2 && p.nPixels <= 1000000, "pixel count", p.nPixels,
            "must lie in [2, 1000000]");
    Require(p.nLines >= 2 && p.nLines <= 10000000, "line count", p.nLines,
            "must lie in [2, 10000000]");
    Require(std::atan(0.5 * p.nPixels * p.dfIFOV) + std::abs(p.dfRollDeg) * kDeg < 50.0 * kDeg,
            "pixel count", p.nPixels, "with this IFOV and roll the swath looks beyond 50 degrees");
    Require(p.nUtmZone >= 0 && p.nUtmZone <= 60, "UTM zone", p.nUtmZone,
            "must be 0 (automatic) or 1 to 60");
    Require(!p.osSensorName.empty() && p.osSensorName.size() < EPH_SENSOR_NAME_SIZE,
            "sensor name length", static_cast<double>(p.osSensorName.size()),
            "must be 1 to 16 characters");
    Require(p.osAcquisitionDate.size() < EPH_DATE_SIZE, "acquisition date length",
            static_cast<double>(p.osAcquisitionDate.size()), "must be at most 27 characters");

    m_dfMeanMotion = std::sqrt(kGM / (p.dfOrbitRadius * p.dfOrbitRadius * p.dfOrbitRadius));
    // Descending pass: the argument of latitude lies between 90 and 270 degrees.
    m_dfArgLat0 = kPi - std::asin(std::sin(dfGeocLat) / dfSinI);
    const double dfCosI = std::cos(p.dfInclinationDeg * kDeg);
    m_dfNode = p.dfNadirLongitudeDeg * kDeg -
               std::atan2(std::sin(m_dfArgLat0) * dfCosI, std::cos(m_dfArgLat0));

    m_dfLineInterval = p.dfLineInterval;
    if (m_dfLineInterval == 0.0) {
        // One line per pixel size of ground track at nadir.
        const Ecef sNow = FrameAt(0.0).sSat;
        const Ecef sLater = FrameAt(1.0).sSat;
        double dfLat = 0.0, dfLon = 0.0, dfHeight = 0.0, dfLat2 = 0.0, dfLon2 = 0.0;
        EcefToGeodetic(sNow, &dfLat, &dfLon, &dfHeight);
        EcefToGeodetic(sLater, &dfLat2, &dfLon2, &dfHeight);
        const double dfGroundSpeed =
            Distance(GeodeticToEcef(dfLat, dfLon, 0.0), GeodeticToEcef(dfLat2, dfLon2, 0.0));
        m_dfLineInterval = dfHeight * p.dfIFOV / dfGroundSpeed;
    }

    InitProjInfo(&m_sGeo, 0);
    if (Geosys2ProjInfo(&m_sGeo, "LONG/LAT D000", 0.0, 0.0, 1.0, 1.0) < 0) {
        throw std::runtime_error("the host does not know the geographic system LONG/LAT D000");
    }
    double dfLat = 0.0, dfLon = 0.0;
    CentreGeodetic(&dfLat, &dfLon);
    int nZone = p.nUtmZone;
    char cBand = 'N';
    int nAutoZone = 0;
    UTMZone(dfLon / kDeg, dfLat / kDeg, &nAutoZone, &cBand);
    if (nZone == 0) nZone = nAutoZone;
    if (cBand == 'Z') cBand = dfLat >= 0.0 ? 'X' : 'C';
    const std::string osUtm = "UTM " + std::to_string(nZone) + " " + cBand + " D000";
    InitProjInfo(&m_sUtm, 0);
    if (Geosys2ProjInfo(&m_sUtm, osUtm.c_str(), 0.0, 0.0, 1.0, 1.0) < 0) {
        throw std::runtime_error("the host does not know the system " + osUtm);
    }
}

double Scene::TimeOfLine(double dfLine) const {
    return (dfLine - CentreLine()) * m_dfLineInterval;
}

Scene::Frame Scene::FrameAt(double dfTime) const {
    const SceneParams& p = m_sParams;
    const double dfI = p.dfInclinationDeg * kDeg;
    const double u = m_dfArgLat0 + m_dfMeanMotion * dfTime;
    const double cu = std::cos(u), su = std::sin(u);
    const double cn = std::cos(m_dfNode), sn = std::sin(m_dfNode);
    const double ci = std::cos(dfI), si = std::sin(dfI);
    const double r = p.dfOrbitRadius;
    // Circular orbit in the inertial frame that coincides with the Earth-fixed
    // one at the centre line.
    const Ecef sPos{r * (cu * cn - su * ci * sn), r * (cu * sn + su * ci * cn), r * su * si};
    const Ecef sVel{-su * cn - cu * ci * sn, -su * sn + cu * ci * cn, cu * si};
    // Orbital frame: z down to the Earth's centre, y to the right of the
    // motion, x forwards.
    const Ecef z = Scale(Unit(sPos), -1.0);
    const Ecef y = Unit(Cross(z, sVel));
    const Ecef x = Cross(y, z);
    // Roll turns the boresight to the left of the motion (higher pixels),
    // pitch then turns it forwards within the rolled plane.
    const double cr = std::cos(p.dfRollDeg * kDeg), sr = std::sin(p.dfRollDeg * kDeg);
    const double cp = std::cos(p.dfPitchDeg * kDeg), sp = std::sin(p.dfPitchDeg * kDeg);
    const Ecef sRolled = Sub(Scale(z, cr), Scale(y, sr));
    const Ecef sBore = Add(Scale(sRolled, cp), Scale(x, sp));
    const Ecef sArray = Sub(Scale(y, -cr), Scale(z, sr));
    const Ecef sForward = Sub(Scale(x, cp), Scale(sRolled, sp));
    return {ToEarthFixed(sPos, dfTime), ToEarthFixed(sBore, dfTime), ToEarthFixed(sArray, dfTime),
            ToEarthFixed(sForward, dfTime)};
}

bool Scene::EcefToImage(const Ecef& sPoint, double* pdfPixel, double* pdfLine) const {
    // The point lies in the plane of view when its offset from the satellite
    // has no forward component; Newton's method on the time.
    auto Offset = [&](double dfTime) {
        const Frame f = FrameAt(dfTime);
        return Dot(f.sForward, Sub(sPoint, f.sSat));
    };
    double dfTime = 0.0;
    const double dfStep = 1e-3;
    bool bConverged = false;
    for (int i = 0; i < 50 && !bConverged; ++i) {
        const double g = Offset(dfTime);
        const double dg = (Offset(dfTime + dfStep) - Offset(dfTime - dfStep)) / (2.0 * dfStep);
        if (!(std::abs(dg) > 0.0)) return false;
        const double dfDelta = g / dg;
        dfTime -= dfDelta;
        bConverged = std::abs(dfDelta) < 1e-11;
    }
    if (!bConverged) return false;
    const Frame f = FrameAt(dfTime);
    const Ecef d = Sub(sPoint, f.sSat);
    const double dfAlongBore = Dot(f.sBore, d);
    if (!(dfAlongBore > 0.0)) return false;
    *pdfPixel = CentreColumn() + Dot(f.sArray, d) / dfAlongBore / m_sParams.dfIFOV;
    *pdfLine = CentreLine() + dfTime / m_dfLineInterval;
    return true;
}

bool Scene::ImageToEcef(double dfPixel, double dfLine, double dfHeight, Ecef* psPoint) const {
    if (!std::isfinite(dfPixel) || !std::isfinite(dfLine) || !std::isfinite(dfHeight)) {
        return false;
    }
    const Frame f = FrameAt(TimeOfLine(dfLine));
    const double dfTan = (dfPixel - CentreColumn()) * m_sParams.dfIFOV;
    const Ecef d = Unit(Add(f.sBore, Scale(f.sArray, dfTan)));
    // Start from a sphere through the nadir height, then secant steps on the
    // geodetic height along the ray.
    auto HeightAt = [&](double dfRange) {
        double dfLat = 0.0, dfLon = 0.0, dfH = 0.0;
        EcefToGeodetic(Add(f.sSat, Scale(d, dfRange)), &dfLat, &dfLon, &dfH);
        return dfH - dfHeight;
    };
    double dfLatS = 0.0, dfLonS = 0.0, dfHS = 0.0;
    EcefToGeodetic(f.sSat, &dfLatS, &dfLonS, &dfHS);
    const double dfRadius = Distance(f.sSat, Ecef{0, 0, 0}) - dfHS + dfHeight;
    const double b = Dot(f.sSat, d);
    const double c = Dot(f.sSat, f.sSat) - dfRadius * dfRadius;
    const double dfDisc = b * b - c;
    if (dfDisc < 0.0) return false;
    double r0 = -b - std::sqrt(dfDisc);
    double r1 = r0 + 10.0;
    double h0 = HeightAt(r0), h1 = HeightAt(r1);
    for (int i = 0; i < 50 && std::abs(h1) > 1e-9; ++i) {
        if (h1 == h0) break;  // converged to the resolution of the height
        const double r2 = r1 - h1 * (r1 - r0) / (h1 - h0);
        r0 = r1;
        h0 = h1;
        r1 = r2;
        h1 = HeightAt(r1);
    }
    if (!(std::abs(h1) <= 1e-6) || !(r1 > 0.0)) return false;
    *psPoint = Add(f.sSat, Scale(d, r1));
    return true;
}

bool Scene::GroundToImage(double dfX, double dfY, double dfZ, double* pdfPixel,
                          double* pdfLine) const {
    double dfLon = 0.0, dfLat = 0.0;
    if (GCTPTransform(&m_sUtm, dfX, dfY, &m_sGeo, &dfLon, &dfLat) != 0) return false;
    return EcefToImage(GeodeticToEcef(dfLat * kDeg, dfLon * kDeg, dfZ), pdfPixel, pdfLine);
}

bool Scene::ImageToGround(double dfPixel, double dfLine, double dfZ, double* pdfX,
                          double* pdfY) const {
    Ecef sPoint{};
    if (!ImageToEcef(dfPixel, dfLine, dfZ, &sPoint)) return false;
    double dfLat = 0.0, dfLon = 0.0, dfH = 0.0;
    EcefToGeodetic(sPoint, &dfLat, &dfLon, &dfH);
    return GCTPTransform(&m_sGeo, dfLon / kDeg, dfLat / kDeg, &m_sUtm, pdfX, pdfY) == 0;
}

void Scene::CentreGeodetic(double* pdfLat, double* pdfLon) const {
    Ecef sCentre{};
    if (!ImageToEcef(CentreColumn(), CentreLine(), 0.0, &sCentre)) {
        throw std::runtime_error("the scene centre's line of sight misses the Earth");
    }
    double dfH = 0.0;
    EcefToGeodetic(sCentre, pdfLat, pdfLon, &dfH);
}

std::vector<SimPoint> Scene::SamplePoints(int nPoints, std::uint32_t nSeed, double dfMinHeight,
                                          double dfMaxHeight, double dfMargin) const {
    return SampleScenePoints(*this, nPoints, nSeed, m_sParams.nPixels, m_sParams.nLines,
                             dfMinHeight, dfMaxHeight, dfMargin, "simulated point");
}

void AddImageNoise(std::vector<SimPoint>* pasPoints, double dfSigma, std::uint32_t nSeed) {
    Require(std::isfinite(dfSigma) && dfSigma >= 0.0, "noise", dfSigma,
            "must be finite and not negative");
    std::mt19937 sGen(nSeed);
    for (SimPoint& s : *pasPoints) {
        s.dfPixel += dfSigma * Gaussian(sGen);
        s.dfLine += dfSigma * Gaussian(sGen);
    }
}

SceneParams AimAt(const SceneParams& sBase, double dfLatDeg, double dfLonDeg, double dfRollDeg,
                  double dfPitchDeg) {
    Require(std::isfinite(dfLatDeg) && std::abs(dfLatDeg) < 85.0, "latitude", dfLatDeg,
            "must lie within +-85 degrees");
    Require(std::isfinite(dfLonDeg) && std::abs(dfLonDeg) <= 180.0, "longitude", dfLonDeg,
            "must lie within +-180 degrees");
    SceneParams sParams = sBase;
    sParams.dfRollDeg = dfRollDeg;
    sParams.dfPitchDeg = dfPitchDeg;
    sParams.dfNadirLatitudeDeg = dfLatDeg;
    sParams.dfNadirLongitudeDeg = dfLonDeg;
    // The image centre moves almost one for one with the nadir point, so a
    // few corrections by the remaining miss converge.
    for (int nRound = 0; nRound < 20; ++nRound) {
        const Scene sScene(sParams);
        double dfLat = 0.0, dfLon = 0.0;
        sScene.CentreGeodetic(&dfLat, &dfLon);
        const double dfMissLat = dfLatDeg - dfLat / kDeg;
        const double dfMissLon = dfLonDeg - dfLon / kDeg;
        if (std::abs(dfMissLat) < 1e-9 && std::abs(dfMissLon) < 1e-9) return sParams;
        sParams.dfNadirLatitudeDeg += dfMissLat;
        sParams.dfNadirLongitudeDeg += dfMissLon;
    }
    throw std::runtime_error("no view of the point with roll " + std::to_string(dfRollDeg) +
                             " and pitch " + std::to_string(dfPitchDeg) + " degrees was found");
}

bool ProjectInto(const Scene& sScene, const SimPoint& sGround, SimPoint* psOut, double dfMargin) {
    double dfPixel = 0.0, dfLine = 0.0;
    if (!sScene.GroundToImage(sGround.dfX, sGround.dfY, sGround.dfZ, &dfPixel, &dfLine)) {
        return false;
    }
    const SceneParams& p = sScene.Params();
    const double dfMinPixel = p.nPixels * dfMargin, dfMaxPixel = p.nPixels * (1.0 - dfMargin);
    const double dfMinLine = p.nLines * dfMargin, dfMaxLine = p.nLines * (1.0 - dfMargin);
    if (!(dfPixel >= dfMinPixel && dfPixel <= dfMaxPixel && dfLine >= dfMinLine &&
          dfLine <= dfMaxLine)) {
        return false;
    }
    *psOut = sGround;
    psOut->dfPixel = dfPixel;
    psOut->dfLine = dfLine;
    return true;
}

EphemerisSeg_t* Scene::MakeSegment() const {
    const SceneParams& p = m_sParams;
    auto* psSeg = static_cast<EphemerisSeg_t*>(HCalloc(1, sizeof(EphemerisSeg_t)));
    std::strncpy(psSeg->szSensorName, p.osSensorName.c_str(), EPH_SENSOR_NAME_SIZE - 1);
    std::strncpy(psSeg->szAcquisitionDate, p.osAcquisitionDate.c_str(), EPH_DATE_SIZE - 1);
    std::strncpy(psSeg->szHeaderText1, "lumo simulated scene", EPH_HEADER_TEXT_SIZE - 1);
    const std::size_t nGeosys =
        std::min<std::size_t>(std::strlen(m_sUtm.szProj), EPH_GEOSYS_SIZE - 1);
    std::memcpy(psSeg->szGeosys, m_sUtm.szProj, nGeosys);
    psSeg->nSupplementFlag = p.bConstrained ? 1 : 0;
    psSeg->dfIFOV = p.dfIFOV;
    psSeg->dfViewAngle = p.dfRollDeg * kDeg;
    psSeg->dfPitchAngle = p.dfPitchDeg * kDeg;
    psSeg->dfCentreColumn = CentreColumn();
    psSeg->dfCentreLine = CentreLine();
    psSeg->dfAngularSpeed = m_dfMeanMotion;
    // The velocity term is the satellite's radial velocity (rate of change of
    // its distance from the Earth's centre): zero on a circular orbit. The
    // model subtracts the slope of the ellipsoid under the track from it to
    // get the rate at which the height above the scene changes.
    psSeg->dfSatVelocity = 0.0;
    psSeg->dfInclination = p.dfInclinationDeg * kDeg;
    psSeg->dfLineInterval = m_dfLineInterval;
    psSeg->dfAscNodeLongitude = m_dfNode;
    psSeg->dfOrbitRadius = p.dfOrbitRadius;

    double dfLat = 0.0, dfLon = 0.0;
    CentreGeodetic(&dfLat, &dfLon);
    psSeg->dfCentreLatitude = dfLat;
    const Ecef sCentre = GeodeticToEcef(dfLat, dfLon, 0.0);
    psSeg->dfSatHeight =
        Distance(FrameAt(0.0).sSat, Ecef{0, 0, 0}) - Distance(sCentre, Ecef{0, 0, 0});
    // Ground spacing of one pixel and one line at the scene centre.
    Ecef sA{}, sB{};
    if (ImageToEcef(CentreColumn() - 0.5, CentreLine(), 0.0, &sA) &&
        ImageToEcef(CentreColumn() + 0.5, CentreLine(), 0.0, &sB)) {
        psSeg->dfPixelRes = Distance(sA, sB);
    }
    if (ImageToEcef(CentreColumn(), CentreLine() - 0.5, 0.0, &sA) &&
        ImageToEcef(CentreColumn(), CentreLine() + 0.5, 0.0, &sB)) {
        psSeg->dfLineRes = Distance(sA, sB);
    }
    psSeg->nNumLines = p.nLines;
    psSeg->nNumPixels = p.nPixels;
    psSeg->nBytesPerPixel = 1;
    psSeg->nBytesPerRecord = p.nPixels;
    psSeg->nOrbitType = EPH_ORBIT_NONE;
    psSeg->ppOrbitData = nullptr;
    return psSeg;
}

}  // namespace lumo::sim
