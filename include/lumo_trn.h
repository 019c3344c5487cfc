// Transform container: one interface to fit a model to control points,
// evaluate it and measure its residuals, whatever the model's kind.
#pragma once

#include "lumo_types.h"
#include "nova/projection.h"

// Kinds of model a container holds.
enum TRNType {
    TRN_POLY = -2,  // host polynomial regression (GEOInfo_t)
    TRN_TPS = -3,   // thin plate spline (TPSInfo_t)
    TRN_RTCS = -4,  // radar model (RTCSInfo_t)
    TRN_SRIT = -5,  // satellite rigorous model (SRITInfo_t)
};

struct EphemerisSeg_t;

// pExtra of a TRN_SRIT fit: the projection of the ground coordinates, the
// image's ephemeris segment and the image-first flag (1: the first point set
// is the image). The container fits on its own copy of the segment and
// keeps its own copy of the projection, so the caller keeps ownership of
// this record and of its segment and may release them at any time.
struct TRNSritExtra_t {
    ProjInfo_t sProj;
    EphemerisSeg_t* psEphemeris;
    int bImageFirst;
};

// One container, created only by TRNAllocate and released by TRNDeallocate.
struct TRNInfo_t {
    int nType;        // TRNType
    int bCalculated;  // 1 once a valid fit has been made, else 0
    void* pModel;     // model record of the kind, owned by the container
};

// A container of the given kind, not yet calculated. An unknown kind is
// reported as warning 11; the container is returned holding no model and
// every later call on it is a no-op.
LUMO_API TRNInfo_t* TRNAllocate(int nType);
LUMO_API void TRNDeallocate(TRNInfo_t* psTrn);

// Fits the model from (x1, y1[, z1]) to (x2, y2) over n points. pExtra is the
// kind's extra argument: for TRN_POLY the regression's integer option array
// (options[0] = order; null for order 1); unused for TRN_TPS; a
// TRNSritExtra_t for TRN_SRIT, whose first set is ground X, Y, Z and second
// set image pixel and line (z2 unused); for TRN_RTCS the image description,
// an RTCSCOpt_t from the host allocator with its line arrays (ground
// projection, line positions, raster size, reference height) that the
// container adopts and releases - on a failed fit too - so the caller never
// releases it; first set ground X, Y, Z in its projection, second set image.
LUMO_API void TRNCalculate(TRNInfo_t* psTrn, int n, double* x1, double* y1, double* x2, double* y2,
                           void* pExtra);
LUMO_API void TRNCalculate3D(TRNInfo_t* psTrn, int n, double* x1, double* y1, double* z1,
                             double* x2, double* y2, double* z2, void* pExtra);

// Evaluates the fitted model. Returns 1; 0 with zero outputs before a valid
// fit. pdfOutZ may be null; when given it is set to 0.
LUMO_API int TRNTransform(TRNInfo_t* psTrn, double dfX, double dfY, double* pdfOutX,
                          double* pdfOutY);
LUMO_API int TRNTransform3D(TRNInfo_t* psTrn, double dfX, double dfY, double dfZ, double* pdfOutX,
                            double* pdfOutY, double* pdfOutZ);

// Root-mean-square residuals of the fitted model over n points; zeros before
// a valid fit; outputs untouched for an unknown kind.
LUMO_API void TRNRMSError(TRNInfo_t* psTrn, int n, double* x1, double* y1, double* x2, double* y2,
                          double* pdfRmsX, double* pdfRmsY);
LUMO_API void TRNRMSError3D(TRNInfo_t* psTrn, int n, double* x1, double* y1, double* z1, double* x2,
                            double* y2, double* pdfRmsX, double* pdfRmsY);
