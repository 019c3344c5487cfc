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

#include "lumo_types.h"

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
