// Scene simulator: a physical push-broom sensor on a circular orbit around
// the WGS 84 ellipsoid, on a descending pass (lines run southwards, pixels
// eastwards). It fills an ephemeris segment from the simulated
// geometry and gives exact image coordinates of ground points (with heights)
// in a UTM zone, so that the rigorous model can be computed and checked
// against the truth.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "lumo_types.h"
#include "projection.h"

namespace lumo::sim {

// What the simulated scene looks like. Angles in degrees, lengths in metres,
// times in seconds.
struct SceneParams {
    double dfOrbitRadius = 6378137.0 + 822000.0;  // from the Earth's centre
    double dfInclinationDeg = 98.7;
    // Geodetic latitude and longitude of the satellite's nadir point at the
    // centre line.
    double dfNadirLatitudeDeg = 45.0;
    double dfNadirLongitudeDeg = 3.0;
    double dfRollDeg = 0.0;          // across-track viewing angle, positive towards higher pixels
    double dfPitchDeg = 0.0;         // along-track viewing angle, positive forwards
    double dfIFOV = 5.0 / 822000.0;  // radians per detector of the straight array
    double dfLineInterval = 0.0;     // seconds per line; 0: one pixel size of ground track
    int nPixels = 12000;             // detectors in the array
    int nLines = 12000;
    std::string osSensorName = "SPOT5_PAN_5";
    std::string osAcquisitionDate = "2026-06-15T10:30:00.000000Z";
    int nUtmZone = 0;           // 0: the zone of the scene centre
    bool bConstrained = false;  // the segment asks for the parameter constraints
};

// One ground point with its exact image position.
struct SimPoint {
    double dfPixel;
    double dfLine;
    double dfX;  // UTM easting
    double dfY;  // UTM northing
    double dfZ;  // height above the ellipsoid
};

// Earth-centred, Earth-fixed position in metres.
struct Ecef {
    double x, y, z;
};

class Scene {
  public:
    // Throws std::invalid_argument naming the bad value.
    explicit Scene(const SceneParams& sParams);

    const SceneParams& Params() const { return m_sParams; }
    // The UTM zone's description ("UTM <zone> <band> D000").
    const ProjInfo_t& Projection() const { return m_sUtm; }
    double CentreColumn() const { return 0.5 * m_sParams.nPixels; }
    double CentreLine() const { return 0.5 * m_sParams.nLines; }
    double LineInterval() const { return m_dfLineInterval; }

    // A new segment (host allocator; release with LumoSatEphemerisFree)
    // whose every field the rigorous model reads is filled from the
    // simulated geometry.
    EphemerisSeg_t* MakeSegment() const;

    // Exact ground-to-image mapping of an Earth-fixed point: the line is the
    // time at which the point lies in the sensor's plane of view, the pixel
    // follows from its look angle along the array. False when the point is
    // behind the sensor or the time search fails.
    bool EcefToImage(const Ecef& sPoint, double* pdfPixel, double* pdfLine) const;
    // The ray of (pixel, line) met at a height above the ellipsoid.
    bool ImageToEcef(double dfPixel, double dfLine, double dfHeight, Ecef* psPoint) const;

    // The same in UTM coordinates of the scene's zone.
    bool GroundToImage(double dfX, double dfY, double dfZ, double* pdfPixel, double* pdfLine) const;
    bool ImageToGround(double dfPixel, double dfLine, double dfZ, double* pdfX, double* pdfY) const;

    // nPoints points spread over the image on a jittered grid (a fraction
    // dfMargin of the image kept free at every edge), heights uniform in
    // [dfMinHeight, dfMaxHeight]; reproducible from nSeed.
    std::vector<SimPoint> SamplePoints(int nPoints, std::uint32_t nSeed, double dfMinHeight,
                                       double dfMaxHeight, double dfMargin = 0.02) const;
    // Ground position of the scene centre at height 0: geodetic latitude and
    // longitude in radians.
    void CentreGeodetic(double* pdfLat, double* pdfLon) const;

  private:
    struct Frame {
        Ecef sSat;      // satellite position
        Ecef sBore;     // boresight (unit)
        Ecef sArray;    // direction of increasing pixel along the array (unit)
        Ecef sForward;  // normal of the plane of view (unit)
    };
    Frame FrameAt(double dfTime) const;
    double TimeOfLine(double dfLine) const;

    SceneParams m_sParams;
    double m_dfMeanMotion = 0.0;  // radians per second
    double m_dfArgLat0 = 0.0;     // argument of latitude at the centre line
    double m_dfNode = 0.0;        // Earth-fixed longitude of the ascending node at t = 0
    double m_dfLineInterval = 0.0;
    ProjInfo_t m_sUtm{};
    ProjInfo_t m_sGeo{};
};

// Parameters of a view of one ground point (geodetic, degrees) from the orbit
// of sBase with the given roll and pitch: the nadir point is moved until the
// image centre looks at the point, so that several views with different
// angles (and dates) cover one area. Throws std::invalid_argument naming the
// bad value, or std::runtime_error when no such view exists.
SceneParams AimAt(const SceneParams& sBase, double dfLatDeg, double dfLonDeg, double dfRollDeg,
                  double dfPitchDeg);

// The image position of the ground point sGround (X, Y, Z used) in a scene,
// into psOut; false when it falls outside the image (a fraction dfMargin of
// the image kept free at every edge) or cannot be mapped.
bool ProjectInto(const Scene& sScene, const SimPoint& sGround, SimPoint* psOut,
                 double dfMargin = 0.0);

// Geodetic (radians, metres) to Earth-fixed and back, WGS 84.
Ecef GeodeticToEcef(double dfLat, double dfLon, double dfHeight);
void EcefToGeodetic(const Ecef& sPoint, double* pdfLat, double* pdfLon, double* pdfHeight);

// Adds Gaussian noise of standard deviation dfSigma (pixels) to the image
// coordinates of the points; reproducible from nSeed.
void AddImageNoise(std::vector<SimPoint>* pasPoints, double dfSigma, std::uint32_t nSeed);

}  // namespace lumo::sim
