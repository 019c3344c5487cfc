// Internal helpers shared by the radar model's source files.
#pragma once

#include <string>

#include "lumo_rtcs.h"

namespace lumo::rtcs {

// Source file named by the family's debug traces.
constexpr const char* kTraceFile = "mathmodel/lumo/rtcscalc.cpp";

// Releases every table and line array of the record and reallocates them,
// zero-filled, for nLines lines (none when nLines is 0); sets
// psCOpt->sLines.nLines. The record must have its option block.
void AllocateTables(RTCSInfo_t* psModel, int nLines);
// Releases the tables only (not the line arrays), and reallocates them for
// psCOpt->sLines.nLines lines.
void AllocateDerivedTables(RTCSInfo_t* psModel);
// Releases an option block together with its line arrays.
void FreeOptionBlock(RTCSCOpt_t* psOpt);

// "E" for ellipsoidal heights, "M" for everything else, after upper-casing.
std::string NormalisedHeightRef(const std::string& osRef);

// What makes a segment unusable for the radar model (empty when it is
// usable): the raster size, pixel spacing, average height and the radar
// line table with at least nNumLines finite, plausible lines.
std::string CheckRadarSegment(const EphemerisSeg_t* psSeg);

// True for image positions where the rational polynomial model was fitted
// and answers: the raster widened by 2 % of its size on every side. Fitting
// only there keeps the model within a hundredth of a pixel of the model's
// own geometry inside the raster (a fit over the whole ground box of the
// grid, most of it imaged far outside the raster, was five times worse).
bool InRpcWindow(const RTCSInfo_t& sModel, double dfPixel, double dfLine);

// True when the record holds a generated model that the transforms can
// evaluate: an option block with lines and pixels, its tables and both
// polynomial fits.
bool IsEvaluable(const RTCSInfo_t* psModel);

// Checks a line-position block before it is read: at least one line and one
// pixel, every array present and every value finite. Returns an empty text,
// or what is wrong, naming the value.
std::string CheckLinePositions(const LinePosition& sLines);

// Quarter-line geometry (tables padfQ...) from the line positions, and the
// per-line range, incidence and spacing tables from the inverse polynomial.
void BuildQuarterLines(RTCSInfo_t* psModel);
void BuildLineParameters(RTCSInfo_t* psModel);
// Samples the finished model on a ground grid and fits the host's rational
// polynomial model to it (replacing any former one; none when the fit fails).
void RTCSBuildRpcModel(RTCSInfo_t* psModel);

// The model's own geometry without the rational polynomial model: the
// polynomial at the reference height and the parallax shift. False when it
// cannot be evaluated. *pbClamped tells whether the reference position lay
// so far outside the raster that the parallax came from another position.
bool OwnGeometryToImage(const RTCSInfo_t* psModel, double dfLon, double dfLat, double dfHeight,
                        double* pdfPixel, double* pdfLine, bool* pbClamped);

// The ground point of (pixel, line) at dfHeight on the model's own geometry:
// the quarter-line intersection with its image-space correction as first
// guess, then Newton steps on OwnGeometryToImage; accepted only when it
// projects back within 1e-4 pixels.
bool OwnImageToGround(const RTCSInfo_t* psModel, double dfPixel, double dfLine, double dfHeight,
                      double* pdfLon, double* pdfLat);

// The transform container's radar fit: the record adopts psOpt (an option
// block of the host allocator with its line arrays) whatever happens - on
// failure it is released and the former model stays - fits the polynomials
// with RTCSCalculate from psOpt's line positions, and derives the
// quarter-line and per-line geometry for them. Fatal errors as
// RTCSCalculate's.
void FitFromImageDescription(RTCSInfo_t* psModel, RTCSCOpt_t* psOpt, int nPoints,
                             const double* padfX, const double* padfY, const double* padfHeight,
                             const double* padfPixel, const double* padfLine);

// Ground coordinates in sProj (affine georeferencing applied) as WGS 84
// longitude and latitude; false when they cannot be converted.
bool ToGeographic(const ProjInfo_t& sProj, double dfX, double dfY, double* pdfLon, double* pdfLat);

// Ellipsoidal height of a height in the model's reference at a position.
double EllipsoidalHeight(const RTCSInfo_t& sModel, double dfLon, double dfLat, double dfHeight);
// Fills sModel.sGeoid over the ground box of the line positions (widened by
// half a degree) from the host's global geoid model. Fatal error 11 when the
// geoid model is not installed.
void BuildGeoidGrid(RTCSInfo_t* psModel);

// A longitude written near dfReference (within 180 degrees of it).
double LongitudeNear(double dfLon, double dfReference);

// Evaluates a fitted regression whose first input is a longitude, with the
// longitude brought next to the fit's own centre.
int TransformFromLongitude(const GEOInfo_t* psGeo, double dfLon, double dfLat, double* pdfOutX,
                           double* pdfOutY);

}  // namespace lumo::rtcs
