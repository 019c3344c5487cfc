// Radar scene simulator: a zero-Doppler synthetic aperture radar on an
// eccentric Keplerian orbit around the rotating WGS 84 Earth, delivering a
// ground-range product. Image line i is the zero-Doppler time of line i;
// pixel p lies a ground distance p x spacing from the first pixel along the
// line's reference surface (the ellipsoid raised by the reference height),
// so a point above that surface is imaged at the reference point with the
// same slant range. It fills a radar ephemeris segment (line table with
// slant ranges and first, middle and last pixel positions) and gives exact
// image positions of ground points with heights, to check the radar model.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "lumo_sim.h"
#include "lumo_types.h"

namespace lumo::sim {

// What the simulated radar scene looks like. Angles in degrees, lengths in
// metres.
struct RadarSceneParams {
    double dfAltitude = 790000.0;  // semi-major axis minus the equatorial radius
    double dfEccentricity = 0.0011;
    double dfPerigeeDeg = 90.0;  // argument of perigee
    double dfInclinationDeg = 98.6;
    // Approximate geodetic position of the scene centre.
    double dfCentreLatDeg = 45.0;
    double dfCentreLonDeg = 10.0;
    bool bAscending = false;
    bool bRightLooking = true;
    bool bRangeIncreasing = true;  // pixel 0 at near range
    double dfNearIncidenceDeg = 30.0;
    double dfPixelSpacing = 12.5;
    double dfLineSpacing = 12.5;
    int nPixels = 4000;
    int nLines = 4000;
    double dfReferenceHeight = 750.0;  // height of the ground-range surface
    std::string osSensorName = "RADAR_SIM";
    std::string osAcquisitionDate = "2026-03-21T06:00:00.000000Z";
};

class RadarScene {
  public:
    // Throws std::invalid_argument naming a bad parameter, or
    // std::runtime_error when the orbit cannot see the requested place.
    explicit RadarScene(const RadarSceneParams& sParams);

    const RadarSceneParams& Params() const { return m_sParams; }

    // A new radar segment (host allocator; LumoSatEphemerisFree).
    EphemerisSeg_t* MakeSegment() const;

    // Ground (longitude, latitude degrees, height above the ellipsoid m) to
    // image; false when the point is not on the looking side or its time
    // cannot be found.
    bool GroundToImage(double dfLon, double dfLat, double dfHeight, double* pdfPixel,
                       double* pdfLine) const;
    bool ImageToGround(double dfPixel, double dfLine, double dfHeight, double* pdfLon,
                       double* pdfLat) const;
    // Incidence angle (degrees) at an image position on the reference surface.
    double IncidenceAt(double dfPixel, double dfLine) const;

    // Points spread over the image (a fraction dfMargin kept free at every
    // edge) with heights uniform in [dfMinHeight, dfMaxHeight]; X and Y of
    // each are longitude and latitude. Reproducible from nSeed.
    std::vector<SimPoint> SamplePoints(int nPoints, std::uint32_t nSeed, double dfMinHeight,
                                       double dfMaxHeight, double dfMargin = 0.02) const;

  private:
    struct Orbit {
        Ecef sPos;
        Ecef sVel;
    };
    Orbit StateAt(double dfTime) const;
    double TimeOfLine(double dfLine) const;
    // Unit in-plane directions of the zero-Doppler plane at dfTime: down
    // (towards the Earth) and towards the looking side.
    void PlaneAxes(const Orbit& sOrbit, Ecef* psDown, Ecef* psSide) const;
    // The point at look angle dfLook (radians from the down axis) at
    // geodetic height dfHeight.
    bool SurfacePoint(const Orbit& sOrbit, double dfLook, double dfHeight, Ecef* psPoint) const;
    // Look angle at which the surface at dfHeight lies at slant range dfRange.
    bool LookForRange(const Orbit& sOrbit, double dfRange, double dfHeight, double* pdfLook) const;
    // The near-range edge of a line on the reference surface.
    struct NearPoint {
        double dfLook = 0.0;
        Ecef sPoint{};
    };
    bool NearEdge(const Orbit& sOrbit, NearPoint* psNear) const;
    // Ground distance along the reference surface from the near-range edge.
    double GroundRange(const Orbit& sOrbit, const NearPoint& sNear, double dfLook) const;
    bool LookForGroundRange(const Orbit& sOrbit, double dfGround, double* pdfLook) const;
    double GroundOfPixel(double dfPixel) const;
    double NearRangeAt(const Orbit& sOrbit) const;
    void CentreAt(double* pdfLat, double* pdfLon);
    void Place();

    RadarSceneParams m_sParams;
    double m_dfSemiMajor = 0.0;
    double m_dfMeanMotion = 0.0;
    double m_dfNode = 0.0;          // Earth-fixed longitude of the ascending node at t = 0
    double m_dfArgLat0 = 0.0;       // argument of latitude at t = 0
    double m_dfLineTime = 0.0;      // seconds per line
    double m_dfNearRange = 0.0;     // slant range of the near-range edge
    double m_dfGroundRadius = 0.0;  // radius that turns reference angles into distances
};

}  // namespace lumo::sim
