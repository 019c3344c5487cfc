// Low-resolution orbit model (model code 3) for wide-swath cross-track
// scanners of the AVHRR class: a mean orbit propagated analytically
// (Brouwer-Lyddane theory of the zonal harmonics J2 to J5), a scanner that
// turns pixel and line into a time and a look direction, three attitude
// angles linear in time and three small orbit corrections refined from
// control points by a Kalman filter; sun and satellite angles per pixel.
//
// Units: model times in seconds (t = 0 is the earliest scan line), distances
// in kilometres in the Earth-fixed frame (ECR), angles in radians inside the
// model and degrees at geographic interfaces (longitude, latitude, the
// angles of LRSComputeAngles). Ground heights are metres where a function
// takes a height from the user and kilometres where it returns one.
//
// Errors: a model or segment that cannot be used (missing sub-record, header
// fields that do not parse, non-finite or impossible elements) raises fatal
// error 11 naming the field and the value; point functions that return int
// give 1 for success and 0 (with the failure values stated) for a point that
// has no answer.
#pragma once

#include <string>
#include <vector>

#include "lumo_types.h"
#include "nova/projection.h"

// ---------------------------------------------------------------------------
// Orbit propagation
// ---------------------------------------------------------------------------

// Element sets are six doubles in this order: semi-major axis (km),
// eccentricity, inclination, right ascension of the ascending node, argument
// of perigee, mean anomaly (radians).
enum LRSElementIndex {
    LRS_ELEM_A = 0,
    LRS_ELEM_E = 1,
    LRS_ELEM_I = 2,
    LRS_ELEM_NODE = 3,
    LRS_ELEM_PERIGEE = 4,
    LRS_ELEM_MEAN_ANOMALY = 5,
    LRS_NUM_ELEMENTS = 6,
};
// Auxiliary outputs of Brolyd: eccentric anomaly, mean argument of latitude,
// mean argument of perigee, anomalistic mean motion (rad/s), true anomaly.
constexpr int LRS_NUM_AUX = 5;

// Earth model of the propagator: gravitational parameter (km^3/s^2),
// equatorial radius (km) and the unnormalised zonal coefficients C20..C50 of
// the potential mu/r (1 + sum Cn0 (Re/r)^n Pn(sin latitude)).
constexpr double LRS_MU = 398600.8;
constexpr double LRS_EARTH_RADIUS = 6378.135;
constexpr double LRS_C20 = -0.0010826158;
constexpr double LRS_C30 = 2.53881e-06;
constexpr double LRS_C40 = 1.65597e-06;
constexpr double LRS_C50 = 2.1848266e-07;

// Propagates the mean elements padfMean (at their epoch) by dfTime seconds.
// nMode 2: full theory (osculating elements in padfOsc); 1: secular motion
// only (padfOsc receives the mean elements as given); 0: no propagation.
// nAdvance 0 keeps the angles of the epoch. nInit must be 1. On return
// padfMean holds the mean elements at dfTime. Mean elements outside the
// theory (a not above the Earth's radius, e outside [0, 1), non-finite
// values) raise fatal error 11.
LUMO_API void Brolyd(double dfTime, double* padfOsc, double* padfMean, int nMode, int nInit,
                     int nAdvance, double* padfAux);
// Position (km) and velocity (km/s) in the inertial frame of the elements;
// a <= 0 with e > 1 is taken as a hyperbola.
LUMO_API void Celem(double* padfElem, double* padfPos, double* padfVel);

// ---------------------------------------------------------------------------
// Model record
// ---------------------------------------------------------------------------

// The scanner: pixel p and line l give the scan angle
// (p - dfRefPixel) * dfScanAngleStep + dfScanAngle0 and the time
// (l - dfRefLine) * dfLineInterval + dfTimeOffset + dfSampleTimeOffset
// + (p - dfRefPixel) * dfSampleInterval; the look direction in the sensor
// frame (x along track, y across, z to nadir) is (0, sin a, cos a).
struct LRSSensorModel_t {
    double dfRefLine;
    double dfRefPixel;
    double dfScanAngle0;
    double dfScanAngleStep;
    double dfTimeOffset;
    double dfLineInterval;
    double dfSampleTimeOffset;
    double dfSampleInterval;
    double adfAlignment[9];  // identity; carried
    int nNumPixels;
};

constexpr int LRS_NUM_ANGLE_GRIDS = 5;
constexpr int LRS_STATE_SIZE = 6;  // x, y, z (km), roll, pitch, yaw (rad)

// The model. Built with new and released with delete; owns its segment
// copy, state table and angle grids (host allocator).
class LUMO_API LRSOrbitModel_t {
  public:
    LRSOrbitModel_t();
    LRSOrbitModel_t(const LRSOrbitModel_t& oOther);
    LRSOrbitModel_t& operator=(const LRSOrbitModel_t& oOther);
    ~LRSOrbitModel_t();

    // A deep copy made with new.
    LRSOrbitModel_t* Clone() const;
    // Makes this model a deep copy of oOther (nothing when it is this model).
    void CopyFrom(const LRSOrbitModel_t& oOther);

    std::vector<ControlPoint_t> asControlPoints;  // of the last refinement
    ProjInfo_t sProjInfo;                         // "LONG/LAT D000"
    std::string osTag;                            // "E"; carried
    EphemerisSeg_t* psEphemeris;                  // owned copy, or null
    LRSSensorModel_t sSensor;
    int nEpochYear;
    double dfEpochSecOfYear;  // start of the epoch year to the element epoch (s)
    double dfTimeOrigin;      // element epoch to model time 0 (s)
    double dfTimeEnd;         // element epoch to the last scan line plus one line (s)
    double dfGreenwichAngle;  // Greenwich sidereal angle at the element epoch (rad)
    double adfMeanElements[LRS_NUM_ELEMENTS];
    int nNumStates;
    double dfFirstStateTime;
    double dfLastStateTime;
    double dfStateInterval;
    double* padfStates;  // nNumStates x LRS_STATE_SIZE, or null
    // Refinement state: corrections of the osculating node, mean anomaly
    // (rad) and semi-major axis (km); attitude polynomials (rate, offset).
    double adfOrbitCorr[3];
    double adfRollPoly[2];
    double adfPitchPoly[2];
    double adfYawPoly[2];
    // Satellite zenith, satellite azimuth, solar zenith, solar azimuth,
    // relative azimuth (degrees), nGridCols x nGridRows each, or null.
    double* apadfAngleGrids[LRS_NUM_ANGLE_GRIDS];
    int nGridCols;
    int nGridRows;
    int nGridColStep;
    int nGridRowStep;
    int nGridColRemainder;
    int nGridRowRemainder;
    int nNumScanLines;

  private:
    void Init();
    void ReleaseTables();
};

// Fills the model from an AVHRR segment (or, for other sensors, from the
// segment's orbit fields). Tables the model holds are released first. A
// segment that cannot give a model raises fatal error 11 naming the field.
LUMO_API void LRSInitOrbitModel(EphemerisSeg_t* psSeg, LRSOrbitModel_t* psModel);
// Releases the state table and the angle grids; the model stays set up.
LUMO_API void LRSDeleteOrbitModel(LRSOrbitModel_t* psModel);
LUMO_API void LRSDelete(LRSOrbitModel_t* psModel, EphemerisSeg_t* psSeg);
// Checks everything the model's functions rely on (finite elements in the
// theory's range, a usable scanner, consistent tables); raises fatal error
// 11 naming the field and its value. Every evaluation runs it.
LUMO_API void LRSCheckOrbitModel(const LRSOrbitModel_t* psModel);

// ---------------------------------------------------------------------------
// Satellite state and attitude
// ---------------------------------------------------------------------------

LUMO_API void CalcEcrOrbitState(const LRSOrbitModel_t* psModel, double dfTime, double* padfPos,
                                double* padfRot);
// From the state table when there is one (clamped to its ends), else direct.
LUMO_API void GetEcrOrbitState(const LRSOrbitModel_t* psModel, double dfTime, double* padfPos,
                               double* padfRot);
LUMO_API void LRSSetupCoordinateMapping(LRSOrbitModel_t* psModel);
LUMO_API void AttitudeMatrix(double dfRoll, double dfPitch, double dfYaw, double* padfRot);
LUMO_API void SatToEcrRotMatrix(const double* padfPos, const double* padfVel, double* padfRot);
LUMO_API void EciToEcr(const LRSOrbitModel_t* psModel, const double* padfEciPos,
                       const double* padfEciVel, double dfTime, double* padfEcrPos,
                       double* padfEcrVel);
LUMO_API double UnwrapAngle(double dfAngle);
LUMO_API void LRSSatelliteXYZ(LRSOrbitModel_t* psModel, double dfPixel, double dfLine,
                              double* padfPos);
LUMO_API void LRSSatelliteXYZAtTime(LRSOrbitModel_t* psModel, double dfDayOfYear, double* padfPos);
// Longitude, latitude (degrees) and height (km) of an ECR position.
LUMO_API void LRSSatelliteLonLatHeight(double* padfPos, double* pdfLon, double* pdfLat,
                                       double* pdfHeight);

// ---------------------------------------------------------------------------
// Image and ground mapping
// ---------------------------------------------------------------------------

// Earth ellipsoid of the mapping (km).
constexpr double LRS_ELLIPSOID_A = 6378.137;
constexpr double LRS_ELLIPSOID_B = 6356.752;

LUMO_API void ImageToSensor(const LRSSensorModel_t* psSensor, double dfLine, double dfPixel,
                            double* pdfTime, double* padfLook);
LUMO_API double SensorToImage(const LRSSensorModel_t* psSensor, const double* padfLook,
                              double dfTime, double* pdfLine, double* pdfPixel);
// The point on the ellipsoid seen by an image point. Returns 0 when the line
// of sight misses the ellipsoid (padfGround is then the ray's point nearest
// the centre in the ellipsoid's scaled space).
LUMO_API int ImageToEcr(LRSOrbitModel_t* psModel, double dfPixel, double dfLine,
                        double* padfGround);
// First intersection of pos + s dir with the ellipsoid; 0 when it misses.
LUMO_API int EcrIntersection(double* padfPos, double* padfDir, double* padfGround);
LUMO_API double InversePixelErr(const LRSOrbitModel_t* psModel, const double* padfGround,
                                double dfTime, double* pdfLine, double* pdfPixel);
// Ground (ECR) to image. Returns 0, with line -10000 and pixel 0, when the
// point is not seen during the state table's time span or the answer does
// not project back onto the point.
LUMO_API int EcrToImage(const LRSOrbitModel_t* psModel, const double* padfGround, double* pdfPixel,
                        double* pdfLine);
LUMO_API void EcrToGeodetic(const double* padfGround, double* pdfLon, double* pdfLat);
LUMO_API void EcrToGeodetic2(double* padfGround, double* pdfLon, double* pdfLat, double* pdfHeight);
// Longitude, latitude (degrees) and ellipsoidal height (metres) to image.
// Returns as EcrToImage; non-finite input or a latitude beyond +-90 degrees
// also gives 0 and the failure values.
LUMO_API int LRSGeodeticToImage(const LRSOrbitModel_t* psModel, double dfLon, double dfLat,
                                double dfHeight, double* pdfPixel, double* pdfLine);
// Image to longitude and latitude on the ellipsoid. Returns as ImageToEcr.
LUMO_API int LRSImageToGeodetic(LRSOrbitModel_t* psModel, double dfPixel, double dfLine,
                                double* pdfLon, double* pdfLat);
// Image to longitude and latitude at an ellipsoidal height (metres): the
// point where the line of sight meets that height. Returns 0 when it does not.
LUMO_API int LRSImageToGeodeticAtHeight(const LRSOrbitModel_t* psModel, double dfPixel,
                                        double dfLine, double dfHeight, double* pdfLon,
                                        double* pdfLat);
// Scan angle (degrees), seconds from the start of the epoch year, epoch year.
LUMO_API void LRSScanAngleAndTime(LRSOrbitModel_t* psModel, double dfPixel, double dfLine,
                                  double* pdfScanAngle, double* pdfTime, int* pnYear);

// ---------------------------------------------------------------------------
// Refinement with control points
// ---------------------------------------------------------------------------

// Control points: dfImageX pixel, dfImageY line, dfGroundX longitude,
// dfGroundY latitude (degrees), dfGroundZ ellipsoidal height (metres).
LUMO_API void LRSRefineOrbitModel(LRSOrbitModel_t* psModel, ControlPoint_t* pasGCPs, int nGCPs);
LUMO_API void LRSRefine(LRSOrbitModel_t* psModel, int nGCPs, double* padfImageX, double* padfImageY,
                        double* padfGroundZ, double* padfGroundX, double* padfGroundY);

// ---------------------------------------------------------------------------
// Sun and satellite angles (degrees)
// ---------------------------------------------------------------------------

LUMO_API void LRSComputeAngles(LRSOrbitModel_t* psModel, double dfPixel, double dfLine,
                               double dfLon, double dfLat, double* pdfSatZenith,
                               double* pdfSatAzimuth, double* pdfSunZenith, double* pdfSunAzimuth,
                               double* pdfRelAzimuth);
LUMO_API void LRSSetupOrbitModelForAngleGeneration(LRSOrbitModel_t* psModel);
LUMO_API void LRSComputeInterpolatedAngles(LRSOrbitModel_t* psModel, double dfPixel, double dfLine,
                                           double* pdfSatZenith, double* pdfSatAzimuth,
                                           double* pdfSunZenith, double* pdfSunAzimuth,
                                           double* pdfRelAzimuth, int nDecode, double* padfScale,
                                           double* padfOffset);
// The angle - 180 (first pair) or + 180 (second pair), brought into [0, 360].
LUMO_API double LRSEncodeSatAzimuthAngle(double dfAngle);
LUMO_API double LRSDecodeRelativeAzimuthAngle(double dfAngle);
LUMO_API double LRSDecodeSatAzimuthAngle(double dfAngle);
LUMO_API double LRSEncodeRelativeAzimuthAngle(double dfAngle);
