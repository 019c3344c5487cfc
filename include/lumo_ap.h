// Aerial photo model: collinearity of a frame camera with fiducial
// transforms, principal point offset, lens distortion, atmospheric
// refraction and Earth curvature.
//
// Three planes of coordinates: ground (X, Y, Z; Z a height in metres), photo
// (x, y in the units of the focal length, origin at the principal point) and
// image (pixel, line of the scanned raster).
#pragma once

#include <string>

#include "lumo_types.h"

constexpr int AP_GEOSYS_SIZE = 17;  // 16 characters and the terminator

// One aerial photo model. The host fills it; APAllocate creates it zero-filled
// with its two text buffers and projection description, APDeallocate
// releases all of it.
struct APInfo_t {
    unsigned char abyCarried0[8];  // carried, not read
    int nCarried1;                 // 1 after allocation, not read
    double dfFocalLength;          // f, photo units
    // Perspective centre on the ground; dfCameraZ is the flying height in metres.
    double dfCameraX;
    double dfCameraY;
    double dfCameraZ;
    double adfCarried2[3];  // carried, not read
    // Rotation R row by row: rows 0 and 1 give the photo x and y numerators,
    // row 2 the common denominator.
    double adfRotation[9];
    // image -> photo: x = e0 + e1 p + e2 l + e3 p l, y = e4 + e5 p + e6 l + e7 p l
    double adfImageToPhoto[8];
    // photo -> image: pixel = d0 + d1 x + d2 y + d3 x y, line = d4 + d5 x + d6 y + d7 x y
    double adfPhotoToImage[8];
    double dfPrincipalX;  // principal point offset, photo units
    double dfPrincipalY;
    double adfRadial[8];       // radial distortion k0 .. k7
    double adfDecentering[4];  // decentering distortion p1 .. p4
    double dfCarried3;         // carried, not read
    double dfEarthRadius;      // R of the curvature correction, metres
    double adfCarried4[2];     // carried, not read
    // Corrections, 0 = off, non-zero = on.
    int bPrincipalPoint;
    int bRadialDistortion;
    int bDecentering;
    int bEarthCurvature;
    int bRefraction;
    int nCarried5;             // carried, not read
    char* pszConformalGeosys;  // AP_GEOSYS_SIZE bytes: projection used when pszGeosys is not
                               // conformal
    char* pszGeosys;           // AP_GEOSYS_SIZE bytes: projection of the ground coordinates
    ProjInfo_t* psProjInfo;    // projection description with its parameters
    char cCode;                // 'M' after allocation, not read
};

LUMO_API APInfo_t* APAllocate();
// Null is ignored.
LUMO_API void APDeallocate(APInfo_t* psAP);
// Why a record cannot be evaluated, naming the field and its value; empty
// when it can: finite values, a non-zero focal length, a rotation matrix
// (R R^T = I to 1e-6), fiducial transforms that are not degenerate, an Earth
// radius when the curvature correction is on and a camera above sea level
// when the refraction correction is on. Every reader of a model file runs it.
LUMO_API std::string APValidate(const APInfo_t* psAP);

// Ground to image. A height of -1e20 stands for 0. A point that cannot be
// seen on the photo (at or behind the perspective centre's plane, or not
// finite) gives -1e20 for both outputs.
LUMO_API void APGeo2Img(const APInfo_t* psAP, double dfX, double dfY, double dfZ, double* pdfPixel,
                        double* pdfLine);
// Ideal photo coordinates to image; dfZ is the point's ground height.
LUMO_API void APPhoto2Img(const APInfo_t* psAP, double dfPhotoX, double dfPhotoY, double dfZ,
                          double* pdfPixel, double* pdfLine);
// Image to ideal photo coordinates; dfZ is the point's ground height.
LUMO_API void APImg2Photo(const APInfo_t* psAP, double dfPixel, double dfLine, double dfZ,
                          double* pdfPhotoX, double* pdfPhotoY);
// Ideal photo coordinates to ground at height dfZ. A ray that does not meet
// that height in front of the camera gives -1e20 for both outputs.
LUMO_API void APPhoto2Geo(const APInfo_t* psAP, double dfPhotoX, double dfPhotoY, double dfZ,
                          double* pdfX, double* pdfY);
// Image to ground at the height *pdfZ (-1e20 becomes 0 and is written back).
// 1 on success; 0 when the ray does not meet the height in front of the
// camera or the result is not finite (the outputs are then -1e20).
LUMO_API int APImg2GeoDem(const APInfo_t* psAP, double dfPixel, double dfLine, double* pdfZ,
                          double* pdfX, double* pdfY);
// Projection of the model's ground coordinates ("PIXEL" when it has none).
LUMO_API void APGetModelProj(const APInfo_t* psAP, ProjInfo_t& sProj);
