// Thin plate spline model: an affine part plus one radial term
// U(r) = r² ln(r²) per control point, interpolating the points exactly.
#pragma once

#include <string>

#include "lumo_trn.h"
#include "lumo_types.h"

constexpr int TPS_GEOSYS_SIZE = 17;  // 16 characters and the terminator

// One spline (x, y) -> (X, Y). Built with new and released with delete.
class LUMO_API TPSInfo_t {
  public:
    explicit TPSInfo_t(int nCPs);
    TPSInfo_t(const TPSInfo_t& oOther);
    TPSInfo_t& operator=(const TPSInfo_t& oOther);
    virtual ~TPSInfo_t();

    // Sizes the four arrays for nCPs points (nothing happens when they
    // already are; n <= 0 releases them). Contents are not kept on a resize.
    void SetNumCPs(int nCPs);

    int nCPs;             // control points in the radial part; 0 after a fit of < 4 points
    double* padfCPX;      // control point x (input plane), nAllocCPs entries
    double* padfCPY;      // control point y
    double* padfCoefX;    // nAllocCPs + 3: [0] constant, [1] x, [2] y, [3 + i] weight of point i
    double* padfCoefY;    // the same for the second output
    double adfAffine[6];  // affine regression of the last fit of >= 2 points (carried only)
    int nRank;            // numerical rank of the last solve
    double dfCondition;   // estimated condition number of the last solve; 0 when not computed
    int nAllocCPs;        // points the arrays are sized for

  private:
    TPSInfo_t();  // sets no field; not used
    void Init();
    void CopyFrom(const TPSInfo_t& oOther);
};

// Fits the spline mapping (padfX[i], padfY[i]) to (padfOutX[i], padfOutY[i]),
// i < n. Arrays too small for n points are resized. All inputs or all outputs
// at one place (n >= 2), a singular system or non-finite coordinates raise
// fatal error 100 (which throws). Reentrant: working storage is per call.
LUMO_API void TPSCalculate(TPSInfo_t* psTps, int n, double* padfX, double* padfY, double* padfOutX,
                           double* padfOutY);
// Evaluates the spline at (dfX, dfY). Reentrant; allocates nothing.
LUMO_API void TPSTransform(TPSInfo_t* psTps, double dfX, double dfY, double* pdfOutX,
                           double* pdfOutY);
// Mean and root-mean-square residuals (transformed - given) over n points;
// four zeros for n < 1. Reentrant.
LUMO_API void TPSRMSError(TPSInfo_t* psTps, int n, double* padfX, double* padfY, double* padfOutX,
                          double* padfOutY, double* pdfMeanX, double* pdfMeanY, double* pdfRmsX,
                          double* pdfRmsY);

// Spline model record (model code 5): one container of kind TRN_TPS per
// direction, the image size and the projection of the ground coordinates.
struct TPSMInfo_t {
    TRNInfo_t* psGeoToImage;  // ground (X, Y) -> image (pixel, line)
    TRNInfo_t* psImageToGeo;  // image -> ground
    int nPixels;
    int nLines;
    char* pszGeosys;  // TPS_GEOSYS_SIZE bytes
    ProjInfo_t* psProjInfo;
};

// A new record with two empty containers; with psExisting given, the new
// parts are stored into it (its former pointers are overwritten, not
// released) and psExisting is returned.
LUMO_API TPSMInfo_t* TPSAllocate(TPSMInfo_t* psExisting);
// Makes psDst transform exactly as psSrc (deep copy); nothing when either is null.
LUMO_API void TPSCopy(TPSMInfo_t* psDst, const TPSMInfo_t* psSrc);
// Releases the record and everything it owns; null is ignored.
LUMO_API void TPSDeallocate(TPSMInfo_t* psModel);
// Why a model cannot be evaluated (a direction without its spline, a radial
// point count of 1 to 3 or beyond the arrays, a value that is not finite),
// naming the field and its value; empty when it can. Every reader of a model
// file runs it.
LUMO_API std::string TPSValidate(const TPSMInfo_t* psModel);
LUMO_API void TPSGeo2Img(TPSMInfo_t* psModel, double dfX, double dfY, double* pdfPixel,
                         double* pdfLine);
LUMO_API void TPSImg2Geo(TPSMInfo_t* psModel, double dfPixel, double dfLine, double* pdfX,
                         double* pdfY);
