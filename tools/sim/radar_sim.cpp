// Radar scene simulator: Keplerian orbit, zero-Doppler plane, slant range to
// ground range on the reference surface, and the radar segment filled from
// them.
#include "radar_sim.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <stdexcept>
#include <string>

#include "lumo_ephemeris.h"
#include "runtime.h"
#include "sim_math.h"

namespace lumo::sim {
namespace {

constexpr int kMaxIterations = 60;

double Length(const Ecef& a) {
    return std::sqrt(Dot(a, a));
}

double GeodeticHeight(const Ecef& sPoint) {
    double dfLat = 0.0, dfLon = 0.0, dfHeight = 0.0;
    EcefToGeodetic(sPoint, &dfLat, &dfLon, &dfHeight);
    return dfHeight;
}

// Angle between two vectors, exact for small angles.
double AngleBetween(const Ecef& a, const Ecef& b) {
    return std::atan2(Length(Cross(a, b)), Dot(a, b));
}

// Root of a monotone function near dfStart by secant steps; false when it
// does not converge to dfTolerance.
template <typename F>
bool SecantRoot(F f, double dfStart, double dfStep, double dfTolerance, double* pdfRoot) {
    double x0 = dfStart, x1 = dfStart + dfStep;
    double f0 = f(x0), f1 = f(x1);
    for (int i = 0; i < kMaxIterations; ++i) {
        if (!std::isfinite(f0) || !std::isfinite(f1)) return false;
        if (std::fabs(f1) <= dfTolerance) {
            *pdfRoot = x1;
            return true;
        }
        if (f1 == f0) return false;
        const double x2 = x1 - f1 * (x1 - x0) / (f1 - f0);
        x0 = x1;
        f0 = f1;
        x1 = x2;
        f1 = f(x1);
    }
    return false;
}

}  // namespace

RadarScene::RadarScene(const RadarSceneParams& sParams) : m_sParams(sParams) {
    const RadarSceneParams& p = m_sParams;
    Require(p.dfAltitude > 200000.0 && p.dfAltitude < 2000000.0, "altitude", p.dfAltitude,
            "must lie in (200 km, 2000 km)");
    Require(p.dfEccentricity >= 0.0 && p.dfEccentricity < 0.01, "eccentricity", p.dfEccentricity,
            "must lie in [0, 0.01)");
    Require(p.dfInclinationDeg > 0.0 && p.dfInclinationDeg < 180.0, "inclination",
            p.dfInclinationDeg, "must lie in (0, 180) degrees");
    Require(std::fabs(p.dfCentreLatDeg) < 89.0, "centre latitude", p.dfCentreLatDeg,
            "must lie within +-89 degrees");
    Require(std::isfinite(p.dfCentreLonDeg), "centre longitude", p.dfCentreLonDeg,
            "must be finite");
    Require(p.dfNearIncidenceDeg >= 10.0 && p.dfNearIncidenceDeg <= 60.0, "near incidence",
            p.dfNearIncidenceDeg, "must lie in [10, 60]");
    Require(p.dfPixelSpacing > 0.1 && p.dfLineSpacing > 0.1, "pixel spacing", p.dfPixelSpacing,
            "spacings must exceed 0.1 m");
    Require(p.nPixels >= 3 && p.nPixels <= 100000, "pixel count", p.nPixels,
            "must lie in [3, 1e5]");
    Require(p.nLines >= 2 && p.nLines <= 1000000, "line count", p.nLines, "must lie in [2, 1e6]");
    Require(std::fabs(p.dfReferenceHeight) < 9000.0, "reference height", p.dfReferenceHeight,
            "must lie within +-9000");
    m_dfSemiMajor = kSemiMajor + p.dfAltitude;
    m_dfMeanMotion = std::sqrt(kGM / (m_dfSemiMajor * m_dfSemiMajor * m_dfSemiMajor));
    Place();
}

RadarScene::Orbit RadarScene::StateAt(double dfTime) const {
    const RadarSceneParams& p = m_sParams;
    const double e = p.dfEccentricity;
    const double w = p.dfPerigeeDeg * kDeg;
    const double inc = p.dfInclinationDeg * kDeg;
    // Mean anomaly at t = 0 from the argument of latitude there.
    const double nu0 = m_dfArgLat0 - w;
    const double E0 = 2.0 * std::atan(std::sqrt((1.0 - e) / (1.0 + e)) * std::tan(nu0 / 2.0));
    const double M = E0 - e * std::sin(E0) + m_dfMeanMotion * dfTime;
    double E = M;
    for (int i = 0; i < 20; ++i) E -= (E - e * std::sin(E) - M) / (1.0 - e * std::cos(E));
    const double nu = 2.0 * std::atan2(std::sqrt(1.0 + e) * std::sin(E / 2.0),
                                       std::sqrt(1.0 - e) * std::cos(E / 2.0));
    const double r = m_dfSemiMajor * (1.0 - e * std::cos(E));
    const double u = w + nu;
    const double cO = std::cos(m_dfNode), sO = std::sin(m_dfNode);
    const double ci = std::cos(inc), si = std::sin(inc);
    const Ecef rHat{cO * std::cos(u) - sO * std::sin(u) * ci,
                    sO * std::cos(u) + cO * std::sin(u) * ci, std::sin(u) * si};
    const Ecef tHat{-cO * std::sin(u) - sO * std::cos(u) * ci,
                    -sO * std::sin(u) + cO * std::cos(u) * ci, std::cos(u) * si};
    const double dfP = m_dfSemiMajor * (1.0 - e * e);
    const double dfH = std::sqrt(kGM / dfP);
    const Ecef sVelEci =
        Add(Scale(rHat, dfH * e * std::sin(nu)), Scale(tHat, dfH * (1.0 + e * std::cos(nu))));
    Orbit s;
    s.sPos = ToEarthFixed(Scale(rHat, r), dfTime);
    // Earth-fixed velocity: the inertial one turned, less the Earth's rotation.
    const Ecef sTurned = ToEarthFixed(sVelEci, dfTime);
    s.sVel = {sTurned.x + kEarthRate * s.sPos.y, sTurned.y - kEarthRate * s.sPos.x, sTurned.z};
    return s;
}

double RadarScene::TimeOfLine(double dfLine) const {
    return (dfLine - 0.5 * (m_sParams.nLines - 1)) * m_dfLineTime;
}

void RadarScene::PlaneAxes(const Orbit& s, Ecef* psDown, Ecef* psSide) const {
    const Ecef v = Unit(s.sVel);
    *psDown = Unit(Sub(Scale(v, Dot(s.sPos, v)), s.sPos));
    const Ecef right = Unit(Cross(s.sVel, s.sPos));
    *psSide = m_sParams.bRightLooking ? right : Scale(right, -1.0);
}

bool RadarScene::SurfacePoint(const Orbit& s, double dfLook, double dfHeight, Ecef* psPoint) const {
    Ecef down{}, side{};
    PlaneAxes(s, &down, &side);
    const Ecef d = Add(Scale(down, std::cos(dfLook)), Scale(side, std::sin(dfLook)));
    // Start from a sphere through the nadir's radius, then on the height.
    const double dfSat = Length(s.sPos);
    const double dfRadius = dfSat - GeodeticHeight(s.sPos) + dfHeight;
    const double b = Dot(s.sPos, d);
    const double dfDisc = b * b - dfSat * dfSat + dfRadius * dfRadius;
    if (dfDisc < 0.0) return false;
    double dfRho = -b - std::sqrt(dfDisc);
    const auto height = [&](double rho) {
        return GeodeticHeight(Add(s.sPos, Scale(d, rho))) - dfHeight;
    };
    if (!SecantRoot(height, dfRho, 10.0, 1e-7, &dfRho)) return false;
    *psPoint = Add(s.sPos, Scale(d, dfRho));
    return true;
}

bool RadarScene::LookForRange(const Orbit& s, double dfRange, double dfHeight,
                              double* pdfLook) const {
    const double dfSat = Length(s.sPos);
    const double dfRadius = dfSat - GeodeticHeight(s.sPos) + dfHeight;
    const double c =
        (dfSat * dfSat + dfRange * dfRange - dfRadius * dfRadius) / (2.0 * dfSat * dfRange);
    if (!(std::fabs(c) <= 1.0)) return false;
    const auto misfit = [&](double look) {
        Ecef q{};
        return SurfacePoint(s, look, dfHeight, &q) ? Distance(q, s.sPos) - dfRange : std::nan("");
    };
    return SecantRoot(misfit, std::acos(c), 1e-5, 1e-7, pdfLook);
}

bool RadarScene::NearEdge(const Orbit& s, NearPoint* psNear) const {
    const double h = m_sParams.dfReferenceHeight;
    return LookForRange(s, m_dfNearRange, h, &psNear->dfLook) &&
           SurfacePoint(s, psNear->dfLook, h, &psNear->sPoint);
}

double RadarScene::GroundRange(const Orbit& s, const NearPoint& sNear, double dfLook) const {
    Ecef q{};
    if (!SurfacePoint(s, dfLook, m_sParams.dfReferenceHeight, &q)) return std::nan("");
    const double dfSign = dfLook >= sNear.dfLook ? 1.0 : -1.0;
    return dfSign * m_dfGroundRadius * AngleBetween(sNear.sPoint, q);
}

bool RadarScene::LookForGroundRange(const Orbit& s, double dfGround, double* pdfLook) const {
    NearPoint sNear;
    if (!NearEdge(s, &sNear)) return false;
    const double dfStart = sNear.dfLook + dfGround / (m_dfNearRange * 2.0);
    const auto misfit = [&](double look) { return GroundRange(s, sNear, look) - dfGround; };
    return SecantRoot(misfit, dfStart, 1e-5, 1e-7, pdfLook);
}

double RadarScene::GroundOfPixel(double dfPixel) const {
    const RadarSceneParams& p = m_sParams;
    const double dfFromNear = p.bRangeIncreasing ? dfPixel : (p.nPixels - 1) - dfPixel;
    return dfFromNear * p.dfPixelSpacing;
}

double RadarScene::NearRangeAt(const Orbit& s) const {
    const RadarSceneParams& p = m_sParams;
    const auto misfit = [&](double look) {
        Ecef q{};
        if (!SurfacePoint(s, look, p.dfReferenceHeight, &q)) return std::nan("");
        double la = 0.0, lo = 0.0, hh = 0.0;
        EcefToGeodetic(q, &la, &lo, &hh);
        const Ecef normal{std::cos(la) * std::cos(lo), std::cos(la) * std::sin(lo), std::sin(la)};
        return AngleBetween(Sub(s.sPos, q), normal) - p.dfNearIncidenceDeg * kDeg;
    };
    double dfLook = 0.0;
    Ecef q{};
    if (!SecantRoot(misfit, p.dfNearIncidenceDeg * kDeg * 0.85, 1e-4, 1e-12, &dfLook) ||
        !SurfacePoint(s, dfLook, p.dfReferenceHeight, &q)) {
        throw std::runtime_error("no look angle gives the near incidence");
    }
    return Distance(q, s.sPos);
}

void RadarScene::CentreAt(double* pdfLat, double* pdfLon) {
    const Orbit s = StateAt(0.0);
    m_dfNearRange = NearRangeAt(s);
    double dfLook = 0.0;
    Ecef sCentre{};
    if (!LookForGroundRange(s, GroundOfPixel(0.5 * (m_sParams.nPixels - 1)), &dfLook) ||
        !SurfacePoint(s, dfLook, m_sParams.dfReferenceHeight, &sCentre)) {
        throw std::runtime_error("the scene centre cannot be placed");
    }
    double hh = 0.0;
    EcefToGeodetic(sCentre, pdfLat, pdfLon, &hh);
}

// Chooses the node and the argument of latitude at t = 0 so that the centre
// pixel falls on the requested place (Newton on both), with the near range
// from the near incidence at the centre line; then the line time from the
// ground speed there.
void RadarScene::Place() {
    const RadarSceneParams& p = m_sParams;
    const double inc = p.dfInclinationDeg * kDeg;
    const double dfLat = p.dfCentreLatDeg * kDeg;
    const double dfLon = p.dfCentreLonDeg * kDeg;
    if (std::fabs(std::sin(dfLat)) >= std::sin(inc)) {
        throw std::runtime_error("the orbit does not reach latitude " +
                                 std::to_string(p.dfCentreLatDeg));
    }
    const double u = std::asin(std::sin(dfLat) / std::sin(inc));
    m_dfArgLat0 = p.bAscending ? u : kPi - u;
    m_dfNode = dfLon - std::atan2(std::cos(inc) * std::sin(m_dfArgLat0), std::cos(m_dfArgLat0));
    m_dfGroundRadius = Length(GeodeticToEcef(dfLat, dfLon, p.dfReferenceHeight));
    constexpr double kDelta = 1e-6;
    for (int nPass = 0; nPass < 10; ++nPass) {
        double la = 0.0, lo = 0.0;
        CentreAt(&la, &lo);
        const double r0 = dfLat - la;
        const double r1 = std::remainder(dfLon - lo, 2.0 * kPi);
        if (std::fabs(r0) < 1e-11 && std::fabs(r1) < 1e-11) break;
        double j[2][2];
        m_dfArgLat0 += kDelta;
        CentreAt(&la, &lo);
        j[0][0] = (dfLat - la - r0) / -kDelta;
        j[1][0] = (std::remainder(dfLon - lo, 2.0 * kPi) - r1) / -kDelta;
        m_dfArgLat0 -= kDelta;
        m_dfNode += kDelta;
        CentreAt(&la, &lo);
        j[0][1] = (dfLat - la - r0) / -kDelta;
        j[1][1] = (std::remainder(dfLon - lo, 2.0 * kPi) - r1) / -kDelta;
        m_dfNode -= kDelta;
        const double det = j[0][0] * j[1][1] - j[0][1] * j[1][0];
        if (!(std::fabs(det) > 0.0)) throw std::runtime_error("the scene cannot be placed");
        m_dfArgLat0 += (j[1][1] * r0 - j[0][1] * r1) / det;
        m_dfNode += (j[0][0] * r1 - j[1][0] * r0) / det;
    }
    double la = 0.0, lo = 0.0;
    CentreAt(&la, &lo);
    double dfLook0 = 0.0, dfLook1 = 0.0;
    Ecef a{}, b{};
    const Orbit s0 = StateAt(0.0), s1 = StateAt(1.0);
    const double dfCentreGround = GroundOfPixel(0.5 * (p.nPixels - 1));
    if (!LookForGroundRange(s0, dfCentreGround, &dfLook0) ||
        !LookForGroundRange(s1, dfCentreGround, &dfLook1) ||
        !SurfacePoint(s0, dfLook0, p.dfReferenceHeight, &a) ||
        !SurfacePoint(s1, dfLook1, p.dfReferenceHeight, &b)) {
        throw std::runtime_error("the ground speed cannot be found");
    }
    m_dfLineTime = p.dfLineSpacing / Distance(a, b);
}

bool RadarScene::GroundToImage(double dfLon, double dfLat, double dfHeight, double* pdfPixel,
                               double* pdfLine) const {
    const Ecef P = GeodeticToEcef(dfLat * kDeg, dfLon * kDeg, dfHeight);
    // Zero-Doppler time: the line of sight is perpendicular to the velocity.
    const auto doppler = [&](double t) {
        const Orbit s = StateAt(t);
        return Dot(Sub(P, s.sPos), Unit(s.sVel));
    };
    double t = 0.0;
    if (!SecantRoot(doppler, 0.0, 0.5, 1e-7, &t)) return false;
    const Orbit s = StateAt(t);
    Ecef down{}, side{};
    PlaneAxes(s, &down, &side);
    if (Dot(Sub(P, s.sPos), side) <= 0.0) return false;  // not on the looking side
    double dfLook = 0.0;
    NearPoint sNear;
    if (!NearEdge(s, &sNear) ||
        !LookForRange(s, Distance(P, s.sPos), m_sParams.dfReferenceHeight, &dfLook)) {
        return false;
    }
    const double dfGround = GroundRange(s, sNear, dfLook);
    const RadarSceneParams& p = m_sParams;
    const double dfFromNear = dfGround / p.dfPixelSpacing;
    *pdfPixel = p.bRangeIncreasing ? dfFromNear : (p.nPixels - 1) - dfFromNear;
    *pdfLine = t / m_dfLineTime + 0.5 * (p.nLines - 1);
    return std::isfinite(*pdfPixel) && std::isfinite(*pdfLine);
}

bool RadarScene::ImageToGround(double dfPixel, double dfLine, double dfHeight, double* pdfLon,
                               double* pdfLat) const {
    const Orbit s = StateAt(TimeOfLine(dfLine));
    double dfLook = 0.0, dfLookH = 0.0;
    Ecef q{}, P{};
    if (!LookForGroundRange(s, GroundOfPixel(dfPixel), &dfLook) ||
        !SurfacePoint(s, dfLook, m_sParams.dfReferenceHeight, &q) ||
        !LookForRange(s, Distance(q, s.sPos), dfHeight, &dfLookH) ||
        !SurfacePoint(s, dfLookH, dfHeight, &P)) {
        return false;
    }
    double la = 0.0, lo = 0.0, hh = 0.0;
    EcefToGeodetic(P, &la, &lo, &hh);
    *pdfLat = la / kDeg;
    *pdfLon = lo / kDeg;
    return true;
}

double RadarScene::IncidenceAt(double dfPixel, double dfLine) const {
    const Orbit s = StateAt(TimeOfLine(dfLine));
    double dfLook = 0.0;
    Ecef q{};
    if (!LookForGroundRange(s, GroundOfPixel(dfPixel), &dfLook) ||
        !SurfacePoint(s, dfLook, m_sParams.dfReferenceHeight, &q)) {
        return std::nan("");
    }
    double la = 0.0, lo = 0.0, hh = 0.0;
    EcefToGeodetic(q, &la, &lo, &hh);
    const Ecef normal{std::cos(la) * std::cos(lo), std::cos(la) * std::sin(lo), std::sin(la)};
    return AngleBetween(Sub(s.sPos, q), normal) / kDeg;
}

std::vector<SimPoint> RadarScene::SamplePoints(int nPoints, std::uint32_t nSeed, double dfMinHeight,
                                               double dfMaxHeight, double dfMargin) const {
    return SampleScenePoints(*this, nPoints, nSeed, m_sParams.nPixels, m_sParams.nLines,
                             dfMinHeight, dfMaxHeight, dfMargin, "simulated radar point");
}

EphemerisSeg_t* RadarScene::MakeSegment() const {
    const RadarSceneParams& p = m_sParams;
    auto* psSeg = static_cast<EphemerisSeg_t*>(HCalloc(1, sizeof(EphemerisSeg_t)));
    std::strncpy(psSeg->szSensorName, p.osSensorName.c_str(), EPH_SENSOR_NAME_SIZE - 1);
    std::strncpy(psSeg->szAcquisitionDate, p.osAcquisitionDate.c_str(), EPH_DATE_SIZE - 1);
    std::strncpy(psSeg->szHeaderText1, "lumo simulated radar scene", EPH_HEADER_TEXT_SIZE - 1);
    std::strncpy(psSeg->szGeosys, "LONG/LAT D000", EPH_GEOSYS_SIZE - 1);
    const Orbit s0 = StateAt(0.0);
    psSeg->dfOrbitRadius = Length(s0.sPos);
    psSeg->dfSatHeight = GeodeticHeight(s0.sPos);
    psSeg->dfInclination = p.dfInclinationDeg * kDeg;
    psSeg->dfAscNodeLongitude = m_dfNode;
    psSeg->dfPerigeeArgument = p.dfPerigeeDeg * kDeg;
    psSeg->dfAngularSpeed = m_dfMeanMotion;
    psSeg->dfLineInterval = m_dfLineTime;
    psSeg->dfCentreColumn = 0.5 * (p.nPixels - 1);
    psSeg->dfCentreLine = 0.5 * (p.nLines - 1);
    psSeg->dfCentreLatitude = p.dfCentreLatDeg * kDeg;
    psSeg->dfPixelRes = p.dfPixelSpacing;
    psSeg->dfLineRes = p.dfLineSpacing;
    psSeg->dfAvgHeight = p.dfReferenceHeight;
    psSeg->nNumLines = p.nLines;
    psSeg->nNumPixels = p.nPixels;
    psSeg->nBytesPerPixel = 2;
    psSeg->nBytesPerRecord = std::min(2 * p.nPixels, 65536);

    auto* psRadar = static_cast<RadarData_t*>(HCalloc(1, sizeof(RadarData_t)));
    psSeg->nOrbitType = EPH_ORBIT_RADAR;
    psSeg->ppOrbitData = static_cast<void**>(HCalloc(1, sizeof(void*)));
    *psSeg->ppOrbitData = psRadar;
    psRadar->nNumLinePositions = p.nLines;
    psRadar->pLinePositions = static_cast<RadarLine_t*>(
        HCalloc(static_cast<std::uint64_t>(p.nLines), sizeof(RadarLine_t)));
    const double adfPixel[3] = {0.0, 0.5 * (p.nPixels - 1), p.nPixels - 1.0};
    for (int i = 0; i < p.nLines; ++i) {
        const Orbit s = StateAt(TimeOfLine(i));
        double adfLat[3], adfLon[3], adfRange[3];
        for (int k = 0; k < 3; ++k) {
            double dfLook = 0.0;
            Ecef q{};
            if (!LookForGroundRange(s, GroundOfPixel(adfPixel[k]), &dfLook) ||
                !SurfacePoint(s, dfLook, p.dfReferenceHeight, &q)) {
                LumoSatEphemerisFree(psSeg);
                throw std::runtime_error("line " + std::to_string(i) + " cannot be placed");
            }
            double hh = 0.0;
            EcefToGeodetic(q, &adfLat[k], &adfLon[k], &hh);
            adfRange[k] = Distance(q, s.sPos);
        }
        RadarLine_t& r = psRadar->pLinePositions[i];
        r.nRangeFirst = static_cast<int32_t>(std::lround(adfRange[0]));
        r.nRangeLast = static_cast<int32_t>(std::lround(adfRange[2]));
        r.fLatFirst = static_cast<float>(adfLat[0] / kDeg);
        r.fLatMid = static_cast<float>(adfLat[1] / kDeg);
        r.fLatLast = static_cast<float>(adfLat[2] / kDeg);
        r.fLonFirst = static_cast<float>(adfLon[0] / kDeg);
        r.fLonMid = static_cast<float>(adfLon[1] / kDeg);
        r.fLonLast = static_cast<float>(adfLon[2] / kDeg);
    }
    return psSeg;
}

}  // namespace lumo::sim
