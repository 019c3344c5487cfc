// Polynomial model: one bivariate polynomial per output, up to order 5.
#pragma once

#include <string>

#include "lumo_types.h"

constexpr int POLY_MAX_COEFFS = 21;
constexpr int POLY_GEOSYS_SIZE = 17;  // 16 characters and the terminator

// Coefficient k multiplies term k of (u, v):
// 1, u, v, uv, u2, v2, u2v, uv2, u3, v3, u2v2, u3v, uv3, u4, v4,
// u3v2, u2v3, u4v, uv4, u5, v5.
struct POLYInfo_t {
    int nCoeffs;  // terms in use, 1..21; 0 after allocation
    int nPixels;
    int nLines;
    double* padfPixelCoeffs;  // pixel from ground (X, Y)
    double* padfLineCoeffs;   // line from ground (X, Y)
    double* padfXCoeffs;      // ground X from (pixel, line)
    double* padfYCoeffs;      // ground Y from (pixel, line)
    char* pszGeosys;          // POLY_GEOSYS_SIZE bytes
    ProjInfo_t* psProjInfo;
};

LUMO_API POLYInfo_t* POLYAllocate();
LUMO_API void POLYCopy(POLYInfo_t* psDst, const POLYInfo_t* psSrc);
LUMO_API void POLYDeallocate(POLYInfo_t* psPoly);
// Why a record cannot be evaluated (a term count outside 1..21, a
// coefficient that is not finite), naming the field and its value; empty
// when it can. Every reader of a model file runs it.
LUMO_API std::string POLYValidate(const POLYInfo_t* psPoly);
LUMO_API void POLYGeo2Img(const POLYInfo_t* psPoly, double dfX, double dfY, double* pdfPixel,
                          double* pdfLine);
LUMO_API void POLYImg2Geo(const POLYInfo_t* psPoly, double dfPixel, double dfLine, double* pdfX,
                          double* pdfY);
