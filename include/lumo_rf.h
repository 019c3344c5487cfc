// Rational function model: pixel and line as ratios of cubic polynomials in
// normalised ground coordinates, its fixed-size binary block and the RPC
// text forms in which image vendors deliver such models.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "lumo_types.h"

constexpr int RF_MAX_TERMS = 20;
constexpr int RF_TEXT_SIZE = 17;  // sensor and georeferencing buffers: 16 characters + NUL
constexpr int RF_ADJUST_TERMS = 6;
constexpr int RF_BINARY_SIZE = 3584;

// Term i of every polynomial, with U, V, W the normalised first ground
// coordinate, second ground coordinate and height:
//  0 1      5 UW     10 UVW    15 V3
//  1 U      6 VW     11 U3     16 VW2
//  2 V      7 U2     12 UV2    17 U2W
//  3 W      8 V2     13 UW2    18 V2W
//  4 UV     9 W2     14 U2V    19 W3
struct RFInfo_t {
    int nHalfPixelShift;  // 1: image coordinates are shifted by half a pixel
    int nAdjust;          // 1: the image-space adjustment is in force
    int nDownsample;      // carried with the model; the transforms do not apply it
    int nTerms;           // terms in use, 0..20
    int nExtra1;          // carried, not interpreted
    int nExtra2;
    double* padfPixelNum;  // max(nTerms, 20) coefficients each
    double* padfPixelDen;
    double* padfLineNum;
    double* padfLineDen;
    double dfXOffset;
    double dfXScale;
    double dfYOffset;
    double dfYScale;
    double dfZOffset;
    double dfZScale;
    double dfPixelOffset;
    double dfPixelScale;
    double dfLineOffset;
    double dfLineScale;
    // a0..a5 over (1, p, l, p*l, p^2, l^2) of the rational functions' pixel p and line l
    double adfPixelAdjust[RF_ADJUST_TERMS];
    double adfLineAdjust[RF_ADJUST_TERMS];
    char* pszSensor;  // RF_TEXT_SIZE bytes, empty when unknown
    char* pszGeosys;  // RF_TEXT_SIZE bytes
    ProjInfo_t* psProjInfo;
};

// A record with default contents for nTerms terms (coefficients 0, offsets
// and scales 0, georeferencing "LON D000"). With psExisting given the new
// contents are placed there (its old pointers are overwritten, not released)
// and psExisting is returned.
LUMO_API RFInfo_t* RFAllocate(RFInfo_t* psExisting, int nTerms);
LUMO_API void RFDeallocate(RFInfo_t* psRF);
// Why a record cannot be evaluated, naming the field and its value; empty
// when it can. Every reader of a model runs it: 1 to 20 terms; finite
// coefficients; offsets and non-zero scales within what a real image and
// place allow (latitudes within +-90 degrees, longitudes within +-360 for
// geographic models); and over the model's own normalised ground cube,
// denominators that neither vanish nor change sign and bounded image values.
LUMO_API std::string RFValidate(const RFInfo_t* psRF);

// Ground to image. A height of -1e20 is taken as 0. A record that cannot be
// evaluated (null, or a scale that is zero or not finite) is reported as a
// warning and gives -1e20 for both outputs, as does a point where a
// denominator vanishes (a pole of the model).
LUMO_API void RFGeo2Img(RFInfo_t* psRF, double dfX, double dfY, double dfZ, double* pdfPixel,
                        double* pdfLine);
// Image to ground at the height *pdfZ (-1e20: the model's height offset,
// written back). *pdfX and *pdfY carry the starting guess in (0 or -1e20: the
// model's offsets) and the result out. The Newton iteration's answer is
// verified: it must map back onto the image point within 1e-3 pixel and, for
// geographic models, lie within +-90 degrees of latitude and half a turn of
// the model's longitude. Returns 1, or 0 with both outputs -1e20 when the
// answer fails that check, the record cannot be evaluated or an input is not
// finite.
LUMO_API int RFImg2Geo(RFInfo_t* psRF, double dfPixel, double dfLine, double* pdfX, double* pdfY,
                       double* pdfZ);
// Batch forms: nCount points per call, for rasters and point clouds. Each
// point gets what the point function gives it, up to rounding (about 1e-12
// pixel): groups of points share vector instructions, large batches are
// split across threads (nova/parallel.h), and the inverse starts every point
// from the functions' first-order inverse (no caller's guess) and verifies
// it like RFImg2Geo. padfZ may be null: height 0 for the forward, the
// model's height offset for the inverse; a height of -1e20 means the same.
// A failed point gets -1e20 in both outputs; panValid, when not null,
// receives 1 per point that succeeded and 0 per failed one. An output may
// be the array of the same point's input. Returns 1 when every point
// succeeded, else 0. A negative count, a null array, one array for both
// outputs or a record that cannot be evaluated is reported as a warning and
// nothing is written. Points of the inverse whose pixel, line or height is
// not finite fail, and the first of them is named in one warning per call.
LUMO_API int RFGeo2ImgBatch(RFInfo_t* psRF, int nCount, const double* padfX, const double* padfY,
                            const double* padfZ, double* padfPixel, double* padfLine,
                            int* panValid);
LUMO_API int RFImg2GeoBatch(RFInfo_t* psRF, int nCount, const double* padfPixel,
                            const double* padfLine, const double* padfZ, double* padfX,
                            double* padfY, int* panValid);
// One Newton step towards the normalised image position (dfPixelN,
// dfLineN) at the fixed normalised height dfW. Returns 1 and the new
// estimate, or 0 (outputs untouched) when the Jacobian is near-singular or
// the functions cannot be evaluated there.
LUMO_API int Newton(RFInfo_t* psRF, double dfPixelN, double dfLineN, double dfU, double dfV,
                    double dfW, double* pdfU, double* pdfV);

// The 3584-byte binary block. The writer returns a new block (released with
// free()) and sets *pnLength to 3584, or returns null with a warning when a
// field cannot be stored without loss (term count outside 0..20, a number
// wider than its field). The reader returns a new record (RFDeallocate), or
// null when the block does not start with "RFMODEL ", is shorter than 3584
// bytes (nLength positive and below that) or holds a model RFValidate
// refuses (reported as warning 11 naming the field).
LUMO_API unsigned char* LumoRFInfoToBinary(RFInfo_t* psRF, int* pnLength);
LUMO_API RFInfo_t* LumoBinaryToRFInfo(int nLength, unsigned char* pabyBlock);

// RPC00B text forms: the "KEY: value" form of *_RPC.TXT files, the
// "name = value;" block form of .RPB files (the ';' may be left out, as some
// producers do) and the fixed-width single record of RPC-*.txt files. Longitude
// is X, latitude Y, sample the pixel; the record gets nHalfPixelShift = 1, so
// pixel (0, 0) is the corner of the first pixel while RPC sample 0 is its
// centre.
enum LumoRPCTextForm {
    LUMO_RPC_TEXT_AUTO = 0,  // reading only: recognised from the text
    LUMO_RPC_TEXT_TXT = 1,
    LUMO_RPC_TEXT_RPB = 2,
    LUMO_RPC_TEXT_FIXED = 3,  // reading only
};

// A field of an RPC text that the model record has no room for: the error
// estimates ERR_BIAS and ERR_RAND, the satellite, band and product names,
// and any other statement a producer adds. Kept so that a conversion from one
// text form to another loses nothing.
struct LumoRPCField {
    std::string osKey;    // as the file spells it ("ERR_BIAS", "errBias", "bandId")
    std::string osValue;  // the value without quotes (and without the unit of ERR_BIAS)
    bool bQuoted;         // the statement form writes the value in double quotes
};

// Reads a model from RPC text. pszSource names the text in messages (a file
// name). Throws nova::DataException naming the source, the line (or the
// byte offset in the fixed-width form) and the key for a missing, repeated or
// malformed key, a non-finite number or a zero scale, and naming the field
// for a model RFValidate refuses. Returns a new record (RFDeallocate); the
// other fields of the text go to *paoFields when given.
LUMO_API RFInfo_t* LumoRPCTextToRFInfo(const char* pszText, std::size_t nLength, int nForm,
                                       const char* pszSource,
                                       std::vector<LumoRPCField>* paoFields = nullptr);
// Writes a model as RPC text in the given form (TXT or RPB), with the fields
// read beside it (ERR_BIAS and errBias and their kin are spelt as the form
// spells them). An image-space adjustment in force is folded into the
// offsets, scales and numerators when that is exact: a shift, or an affine
// change whose cross terms join pixel and line of one shared denominator.
// Throws nova::DataException when the model has no RPC equivalent
// (second-order adjustment, cross terms over different denominators, ground
// coordinates not geographic, more than 20 terms, values not finite).
LUMO_API std::string LumoRFInfoToRPCText(const RFInfo_t* psRF, int nForm,
                                         const std::vector<LumoRPCField>& aoFields = {});
// The form of a text: LUMO_RPC_TEXT_TXT, LUMO_RPC_TEXT_RPB,
// LUMO_RPC_TEXT_FIXED, or LUMO_RPC_TEXT_AUTO when it looks like none.
LUMO_API int LumoDetectRPCTextForm(const char* pszText, std::size_t nLength);

// The image-space adjustment a fit computes, by its number of terms: a
// shift (a0, b0), an affine change (a0..a2, b0..b2) or all six terms.
enum RFAdjustKind {
    RF_ADJUST_SHIFT = 1,
    RF_ADJUST_AFFINE = 3,
    RF_ADJUST_SECOND = 6,
};

// Fits the image-space adjustment of psRF to nGCP control points (ground X,
// Y, height and measured pixel, line) by least squares, the bias
// compensation of a delivered model: the terms of nKind are computed from
// the rational functions' own pixel and line (the half-pixel shift is the
// constant's to carry), the others set to 0, and nAdjust to 1. Returns 1,
// or 0 with the record unchanged when the points do not determine the
// terms (fewer points than terms; for the affine and second-order kinds,
// points on a line). A null record or array, an unknown kind, a negative
// count, a coordinate that is not a number or a point the rational
// functions cannot map raise fatal error 11 naming it.
LUMO_API int RFComputeAdjustment(RFInfo_t* psRF, int nKind, int nGCP, const double* padfX,
                                 const double* padfY, const double* padfZ, const double* padfPixel,
                                 const double* padfLine);
