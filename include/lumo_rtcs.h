// Radar model (RTCS): geometry primitives shared with the low-resolution
// orbit model, the per-line position record of a radar scene, and the
// radar model's record and entry points.
//
// Conventions: geodetic points are (longitude, latitude, height) in degrees
// and metres; vectors are 3 doubles; an ellipsoid parameter block is 8
// doubles [a, b, a², b², a²/b², f, e², e'²] of which the caller fills a and
// b and RTCSSetEllipsoidParameters the rest.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "lumo_types.h"
#include "nova/projection.h"
#include "nova/regression.h"

namespace nova {
namespace mathmodel {
class RpcMathModel;
}  // namespace mathmodel
namespace dem {
class IRasterDEM;
}  // namespace dem
namespace ogc {
namespace ct {
class IMathTransform;
}  // namespace ct
}  // namespace ogc
}  // namespace nova

// ---------------------------------------------------------------------------
// Per-line ground positions of a radar raster: one element per image line,
// element 0 being image line 1. Arrays come from the host allocator.
// ---------------------------------------------------------------------------
struct LinePosition {
    double* padfRangeFirst;  // slant range of the line's first pixel, metres
    double* padfRangeLast;   // slant range of the line's last pixel
    double* padfLonFirst;    // longitude of the first pixel, degrees
    double* padfLonMid;      // longitude of the middle pixel
    double* padfLonLast;     // longitude of the last pixel
    double* padfLatFirst;    // latitude of the first pixel, degrees
    double* padfLatMid;      // latitude of the middle pixel
    double* padfLatLast;     // latitude of the last pixel
    int32_t nPixels;         // pixels per line
    int32_t nLines;          // lines, and elements in each array
};

// Size of an ellipsoid parameter block.
constexpr int RTCS_ELLIPSOID_SIZE = 8;

// ---------------------------------------------------------------------------
// Geometry primitives. None keeps state; all are reentrant.
// ---------------------------------------------------------------------------

// Fills [2] to [7] of an ellipsoid block from a = [0] and b = [1].
LUMO_API void RTCSSetEllipsoidParameters(double* padfEll);
// Geodetic point (lon, lat degrees, height m) to Cartesian, on the ellipsoid.
LUMO_API void RTCSGeodetic2XYZ(const double* padfGeo, const double* padfEll, double* padfXYZ);
// Cartesian to geodetic point, closed form in one step: exact to 0.1 mm near
// the surface, to a few millimetres at orbit heights.
LUMO_API void RTCSXYZ2Geodetic(const double* padfXYZ, const double* padfEll, double* padfGeo);
// Spherical (radians) to Cartesian.
LUMO_API void RTCSPolarXYZ(const double* pdfLat, const double* pdfLon, const double* pdfRadius,
                           double* padfXYZ);
// Cartesian to spherical latitude and longitude (radians) and the height
// above the WGS 84 local radius raised by dfHeightOffset.
LUMO_API void RTCSXYZPolar(const double* padfXYZ, double dfHeightOffset, double& dfLat,
                           double& dfLon, double& dfHeight);
LUMO_API double RTCSVectorLength(const double* a);
LUMO_API double RTCSVectorDistance(const double* a, const double* b);
// *pdfLength = |a|; pOut = a / |a| when |a| is not 0, else pOut is untouched.
LUMO_API void RTCSNormalize(const double* a, double* pOut, double* pdfLength);
LUMO_API void RTCSDotProduct(const double* a, const double* b, double* pdfOut);
LUMO_API void RTCSCrossProduct(const double* a, const double* b, double* pOut);
// Angle opposite side c of the triangle with sides a, b, c; 0 when 2ab is not
// positive. Sides that violate the triangle inequality by rounding give 0 or
// pi rather than a NaN.
LUMO_API double RTCSInteriorAngle(double a, double b, double c);

// Geodetic (degrees, metres) to Earth-centred rotating Cartesian coordinates
// in kilometres (GeodeticToEcr) or metres (GeodeticToEcrM), on the ellipsoid
// a = 6378.137 km, b = 6356.752 km.
LUMO_API void GeodeticToEcr(double dfLon, double dfLat, double dfHeight, double* padfEcr);
LUMO_API void GeodeticToEcrM(double dfLon, double dfLat, double dfHeight, double* padfEcr);

// Line position interpolation at the line coordinate dfLine (element k of
// the arrays belongs to line coordinate k + 1): the first and last slant
// ranges and the latitudes and longitudes (degrees) of the first, middle and
// last pixel. *pnOutside is 1 when dfLine lies outside [0, nLines] (or is not
// a number); the six positions are then 0 and the ranges are left as they
// were. Only elements 0 .. nLines - 1 are ever read.
LUMO_API void RTCSGetPositionInfo(const LinePosition* psLines, int nLines, double dfLine,
                                  double* pdfRangeFirst, double* pdfRangeLast, double* padfLat,
                                  double* padfLon, int* pnOutside);

// Solves the 3x3 system whose rows are padfRow0..2 for padfX (Gauss-Jordan
// with full pivoting); *pnStatus 0, or -1 when the system is singular or not
// finite (padfX is then unspecified). The inputs are not changed.
LUMO_API void RTCSSolveEqn(const double* padfRow0, const double* padfRow1, const double* padfRow2,
                           const double* padfRhs, double* padfX, int* pnStatus);

// Coefficients (constant first) of the polynomial of degree n - 1 through
// the n = *pnPoints points (padfX[k], padfY[k]); n must be 2 to 20 and the
// abscissae distinct. *pnStatus 0, or -1 (padfCoefs unspecified).
LUMO_API void RTCSPolyCoef(const double* padfX, const double* padfY, double* padfCoefs,
                           const int* pnPoints, int* pnStatus);

// ---------------------------------------------------------------------------
// The radar model.
//
// Image coordinates: pixel 0.0 is the centre of the first pixel of a line
// (the one whose slant range is the segment's nRangeFirst), line 0.0 the
// first line of the segment's line table. Ground coordinates: longitude and
// latitude in degrees (WGS 84) and the height in metres in the model's
// height reference: above mean sea level (EGM96) for models whose control
// points were ("M"), above the WGS 84 ellipsoid for "E" models. The
// segment's average height, the model's reference surface, is taken as
// ellipsoidal.
// ---------------------------------------------------------------------------

// Marks a quarter line whose geometry could not be solved (first step
// coefficient of padfQStepCoefs).
constexpr double RTCS_FAILED_QUARTER = -999999.0;

// The model's option block: ground projection, line positions, reference
// height. Allocated with HCalloc and released with free together with the
// line arrays.
struct RTCSCOpt_t {
    ProjInfo_t sProj;     // "LON" once generated
    LinePosition sLines;  // line positions and raster size
    double dfAvgHt;       // reference (average) height of the scene, metres
};

// Geoid undulation (height of mean sea level above the WGS 84 ellipsoid,
// metres) on a regular longitude/latitude grid over a scene; empty when the
// model takes ellipsoidal heights.
struct RTCSGeoidGrid {
    int nCols = 0;
    int nRows = 0;
    double dfLon0 = 0.0;  // node (0, 0), degrees
    double dfLat0 = 0.0;
    double dfStep = 0.0;                // degrees between nodes
    std::vector<double> adfUndulation;  // row by row, nCols x nRows
};

// The radar model record. Tables hold psCOpt->sLines.nLines lines (lines
// below), quarter-line tables four entries per line; all are host-allocator
// blocks released with free.
class RTCSInfo_t {
  public:
    RTCSInfo_t();   // an empty model, tables for one line
    ~RTCSInfo_t();  // releases everything the record owns
    RTCSInfo_t(const RTCSInfo_t&) = delete;
    RTCSInfo_t& operator=(const RTCSInfo_t&) = delete;

    std::vector<ControlPoint_t> vecGcps;  // control points the model was generated from
    ProjInfo_t sGcpProj;                  // their ground projection
    std::string osHeightRef;              // "E" ellipsoidal or "M" mean sea level
    EphemerisSeg_t* psEphemeris;          // owned copy, or null
    GEOInfo_t sGeoFwd;                    // (lon, lat) -> image at the reference height
    GEOInfo_t sGeoInv;                    // image at the reference height -> (lon, lat)
    int32_t nNumPixels;
    int32_t nRangeDirection;  // +1: slant range grows from the first to the last pixel
    int32_t nDownsample;
    double dfPixelRes;
    double dfLineRes;
    double dfStartRangeFirst;
    double dfStartRangeLast;
    double dfMinGcpHeight;
    double dfMaxGcpHeight;
    RTCSCOpt_t* psCOpt;                         // owned
    nova::mathmodel::RpcMathModel* poRpcModel;  // owned, or null; answers first
    double* padfRangeCoefs;      // [3 * lines] slant range as a quadratic of the pixel
    double* padfIncidenceCoefs;  // [3 * lines] incidence angle (radians), quadratic
    double* padfPixelSpacing;    // [lines] ground length of one pixel, metres
    double* padfQRangeFirst;     // [4 * lines]
    double* padfQRangeLast;      // [4 * lines]
    double* padfQStepCoefs;      // [12 * lines] angular step per pixel, quadratic
    double* padfQAngleNearFar;   // [4 * lines]
    double* padfQAngleFarSat;    // [4 * lines]
    double* padfQAngleNearSat;   // [4 * lines]
    double* padfQUnitNear;       // [12 * lines]
    double* padfQUnitFar;        // [12 * lines]
    double* padfQUnitSat;        // [12 * lines]
    double* padfQSatPos;         // [12 * lines] metres
    double* padfQSatRadius;      // [4 * lines]
    double* padfQRadiusNear;     // [4 * lines]
    double* padfQRadiusMid;      // [4 * lines]
    double* padfQRadiusFar;      // [4 * lines]
    // Added after the tables: the geoid of a model whose heights are above
    // mean sea level ("M"), so that its transforms take heights in the
    // reference its control points were given in.
    RTCSGeoidGrid sGeoid;
};

// An empty model (null when it cannot be created); release with
// RTCSFreeModel.
LUMO_API RTCSInfo_t* RTCSAllocate();
LUMO_API void RTCSFreeModel(RTCSInfo_t* psModel);
// Makes psDst a deep copy of psSrc; nothing when either is null or both are
// the same record.
LUMO_API void RTCSCopy(RTCSInfo_t* psDst, const RTCSInfo_t* psSrc);

// Ground (longitude, latitude degrees, ellipsoidal height metres; -1e20 is
// taken as 0) to image. Returns 1; 0 with -1e20 in both outputs when the
// record cannot be evaluated (not generated) or the input is not finite.
LUMO_API int RTCSGeo2Img(const RTCSInfo_t* psModel, double dfX, double dfY, double dfZ,
                         double* pdfPixel, double* pdfLine);
// Image position and height to longitude and latitude. Returns 1 on
// success; 0 for a height of -1e20 (outputs -1e20), and when the image
// position cannot be placed on the ground.
LUMO_API int RTCSImg2Geo(const RTCSInfo_t* psModel, double dfPixel, double dfLine, double dfZ,
                         double* pdfX, double* pdfY);
// As RTCSImg2Geo with the height in *pdfZ; -1e20 is replaced by 0 and written
// back.
LUMO_API int RTCSImg2GeoDem(const RTCSInfo_t* psModel, double dfPixel, double dfLine, double* pdfZ,
                            double* pdfX, double* pdfY);

// ---------------------------------------------------------------------------
// Generation
// ---------------------------------------------------------------------------

// A new model from a radar segment (orbit sub-record kind 2 with at least
// nNumLines line elements) and control points whose ground coordinates are
// in sProj with heights above mean sea level (osHeightRef "M", the default
// for anything but "E"/"e") or the ellipsoid ("E"). Release with
// RTCSFreeModel. A segment or control point that cannot make a model is
// refused with fatal error 11 (nova::NumberedError) naming the bad value;
// control points that cannot be converted to WGS 84 throw the conversion's
// nova::Exception. The caller's segment and points are never changed.
LUMO_API RTCSInfo_t* RTCSGenModel(const EphemerisSeg_t* psSeg, const ProjInfo_t& sProj,
                                  const std::string& osHeightRef,
                                  const std::vector<ControlPoint_t>& aoGcps);

// Per-line geometry from the first and last slant range and the first,
// middle and last pixel's latitude and longitude (degrees) raised by
// dfAvgHt: satellite position, and quadratics in the pixel (samples at
// pixels 1, nPixels / 2 and nPixels) of the radius, slant range, incidence
// angle and X, Y, Z; the pixel spacing. *pnStatus 0, or -1 when the
// geometry cannot be solved (outputs unspecified).
LUMO_API void RTCSCalParameters(double dfRangeFirst, double dfRangeLast, double dfAvgHt,
                                double* padfSatPos, const double* padfLat, const double* padfLon,
                                double* padfRadiusCoefs, double* padfRangeCoefs,
                                double* padfIncidenceCoefs, double* padfXCoefs, double* padfYCoefs,
                                double* padfZCoefs, double* pdfPixelSpacing, int nPixels,
                                int* pnStatus);

// ---------------------------------------------------------------------------
// Control point reduction and polynomial fits
// ---------------------------------------------------------------------------

// Moves each control point's pixel to where it would be imaged at the
// reference height dfAvgHt, then fits psGeoFwd ((lon, lat) -> image) and
// psGeoInv (image -> (lon, lat)) of order 2 to the reduced points.
LUMO_API void RTCSGeoToImg(const LinePosition* psLines, int nPoints, const double* padfLat,
                           const double* padfLon, const double* padfHeight, const double* padfPixel,
                           const double* padfLine, int nPixels, int nLines, double dfMinHeight,
                           double dfMaxHeight, double dfAvgHt, GEOInfo_t* psGeoFwd,
                           GEOInfo_t* psGeoInv);
// Search window of the reduction: pixels towards near (*pnLowCount) and far
// range (*pnHighCount) that heights dfLowRel and dfHighRel above the
// reference can shift a point.
LUMO_API void RTCSParallaxCal(double dfRangeFirst, double dfRangeLast, const double* padfSatPos,
                              const double* pdfRadius, double dfPixelSpacing, double dfLowRel,
                              double dfHighRel, int* pnLowCount, int* pnHighCount);
// The reduction and fits from ground coordinates in psProj (affine
// georeferencing applied, converted to geographic on the projection's own
// earth model). A pixel outside [0, nPixels] or a line outside [0, nLines]
// is fatal error 189 ("X_img" / "Y_img" with the point's number from 1); bad
// line positions, non-finite points or a projection that cannot be
// converted are fatal error 11.
LUMO_API void RTCSCalculate(GEOInfo_t* psGeoFwd, GEOInfo_t* psGeoInv, const LinePosition* psLines,
                            int nPoints, ProjInfo_t* psProj, const double* padfPixel,
                            const double* padfLine, const double* padfX, const double* padfY,
                            const double* padfHeight, double dfAvgHt, int nPixels, int nLines);

// ---------------------------------------------------------------------------
// Intersection, parallax and stereo
// ---------------------------------------------------------------------------

// The ground point of (pixel, line) at dfHeight, from the quarter-line
// geometry. 1, or 0 when the line lies outside the table, the quarter line
// failed or the geometry cannot be solved.
LUMO_API int RTCSCalGeodetic(const RTCSInfo_t* psModel, double dfPixel, double dfLine,
                             double dfHeight, double* pdfLon, double* pdfLat);
// The same, corrected once in image space through RTCSGeo2Img.
LUMO_API int RTCSCalGeodeticPosition(const RTCSInfo_t* psModel, double dfPixel, double dfLine,
                                     double dfHeight, double* pdfLon, double* pdfLat);
// Across-track shift (pixels) of a point dfDeltaHeight above the reference
// at pixel dfPixel of line nLine, with the slant range, raised range,
// incidence and look angle it is computed from. nLine must index the
// tables.
LUMO_API void calculate_parallax_shift(int nLine, int nDirection, const double* padfSpacing,
                                       const double* padfIncidenceCoefs,
                                       const double* padfRangeCoefs, double dfDeltaHeight,
                                       double dfPixel, double* pdfRange, double* pdfRaisedRange,
                                       double* pdfIncidence, double* pdfAngle, double* pdfShift);
// The same shift from one line's coefficients (nLine is not used).
LUMO_API void RTCSCalShiftParallax(int nLine, int nDirection, double dfSpacing,
                                   const double* padfIncidenceCoefs, const double* padfRangeCoefs,
                                   double dfDeltaHeight, double dfPixel, double& dfShift);
// Polynomial ground-to-image transform with a parallax correction for
// models kept outside RTCSInfo_t.
LUMO_API void RTCSTransform(GEOInfo_t* psGeoFwd, GEOInfo_t* psGeoInv, LinePosition* psLines,
                            int nPixels, double dfAvgHt, double dfX, double dfY,
                            double dfDeltaHeight, double* pdfPixel, double* pdfLine);
// Satellite position from two geodetic points with their slant ranges as
// fourth value. True on success; false with a zero position otherwise.
LUMO_API bool RTCSSatPositionAtLine(const double* padfPoint1, const double* padfPoint2,
                                    const double* padfEll, double* padfSatPos, double* padfSatGeo,
                                    double* padfAngles, double* padfUnit1, double* padfUnit2,
                                    double* padfNormal);
// Geodetic point of a pixel from per-line Cartesian polynomials.
LUMO_API void RTCSDetPoint(int nCoefs, const double* padfXCoefs, const double* padfYCoefs,
                           const double* padfZCoefs, double dfPixel, double dfHeightOffset,
                           double& dfLat, double& dfLon, double& dfHeight, double* padfXYZ);
// Height and position of a point seen in two radar images. 1 on success; 0
// with zero outputs when the images cannot place it.
LUMO_API int RTCSDetGeo(const RTCSInfo_t* psModel1, const RTCSInfo_t* psModel2, double dfPixel1,
                        double dfLine1, double dfPixel2, double dfLine2, double& dfLon,
                        double& dfLat, double& dfHeight);

// ---------------------------------------------------------------------------
// Height adjustment of nominal control points
// ---------------------------------------------------------------------------

// Moves every point of a row-major grid of nominal control points along its
// line of constant slant range to dfHeight and compacts the seven arrays,
// dropping points that cannot be moved (*pnCount: points in, points kept).
LUMO_API void RTCSAddElevationsToNominalGCPs(double dfHeight, int nRows, int nCols,
                                             double dfRangeFirst, double dfRangeLast,
                                             double dfSemiMajor, double dfSemiMinor, int* pnCount,
                                             int* panIds, double* padfA, double* padfB,
                                             double* padfC, double* padfLon, double* padfLat,
                                             double* padfHeight);
// One row; points that cannot be moved get the height -1e20.
LUMO_API void RTCSAdjustGCPRowForElevation(double dfHeight, nova::dem::IRasterDEM* poDem,
                                           nova::ogc::ct::IMathTransform* poTransform,
                                           const double* padfPoint1, const double* padfPoint2,
                                           const double* padfEll, int nPoints, double* padfLon,
                                           double* padfLat, double* padfHeight);
// One point (longitude, latitude, height; rewritten on success).
LUMO_API bool RTCSAdjustGCP(double dfHeight, double* padfPoint, const double* padfSatPos,
                            const double* padfAngles, const double* padfUnitSat,
                            const double* padfUnit2, const double* padfNormal,
                            nova::dem::IRasterDEM* poDem,
                            nova::ogc::ct::IMathTransform* poTransform, const double* padfEll,
                            double dfTolerance);
