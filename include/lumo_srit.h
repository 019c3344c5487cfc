// Satellite rigorous model (Toutin): the model record, its allocation, copy
// and release, the exported entry points with their implementation twins, and
// the SPOT level 1A/1B image-coordinate conversions.
//
// A computation that fails does not adopt the segment passed to it: the
// caller still owns it.
// Transforms given a null model or a record without a segment answer
// LUMO_NULL_VALUE.
#pragma once

#include <cstdint>
#include <string>

#include "lumo_types.h"

constexpr int SRIT_NUM_COEFS = 23;
constexpr int SRIT_NUM_AUX = 4;
// anAux[SRIT_AUX_FORM] selects the form of the elevation scale (1 - 2 k Z / c0)
// in the image-to-ground equations. Over the curved Earth the local vertical
// at across-track distance u is tilted by 2u / c0, so the tangent of the
// incidence angle, and with it the elevation displacement, grows by
// (tan^2 + 1) 2u / c0. The classic form (0, what SRITAllocate gives) takes
// k = 1, right at nadir only; the curved-incidence form (1) takes
// k = c15^2 + 1, as the displacement rate c9 does. Off nadir the classic form
// misses by 2 c15^2 Z u / c0: about 20 m at the swath edge at 40 degrees of
// roll over 2000 m of relief. A computation uses the form the caller set in
// the record and keeps it; the transforms read it, so a record means the same
// wherever it is evaluated.
constexpr int SRIT_AUX_FORM = 1;
constexpr int32_t SRIT_FORM_CLASSIC = 0;
constexpr int32_t SRIT_FORM_CURVED_INCIDENCE = 1;
constexpr int SRIT_AUX_TEXT_SIZE = 17;  // 16 characters and the terminator
constexpr int SRIT_NUM_AUX_VALUES = 3;
constexpr int SRIT_AUX_BLOCK_SIZE = 1024;
constexpr int SRIT_AUX_BLOCK_D_SIZE = 2048;
constexpr int SRIT_SENSOR_SIZE = 16;  // not terminated when all 16 are used
constexpr int SRIT_MAX_IMAGES = 250;
constexpr int SRIT_ID_SIZE = 64;  // image and point identifiers, blank padded

// One computed rigorous model of one image. Blocks come from the host
// allocator and are released with free(); the record owns its two line
// arrays, the segment and the projection copy.
struct SRITInfo_t {
    double adfCoef[SRIT_NUM_COEFS];  // model coefficients c0 ... c22
    // [0] is the math model object's downsample factor, [SRIT_AUX_FORM] the
    // form of the equations; the rest are carried.
    int32_t anAux[SRIT_NUM_AUX];
    char szAuxA[SRIT_AUX_TEXT_SIZE];               // conformal working projection (host's)
    char szAuxB[SRIT_AUX_TEXT_SIZE];               // model's ground projection text (host's)
    uint8_t bAux;                                  // carried
    double adfAux[SRIT_NUM_AUX_VALUES];            // carried
    unsigned char abyAuxA[SRIT_AUX_BLOCK_SIZE];    // carried
    unsigned char abyAuxB[SRIT_AUX_BLOCK_SIZE];    // carried
    unsigned char abyAuxC[SRIT_AUX_BLOCK_SIZE];    // carried
    unsigned char abyAuxD[SRIT_AUX_BLOCK_D_SIZE];  // carried
    // One value per image line (the segment's nNumAttitudeLines), or null:
    // the dfValue2 (B) and dfValue1 (A) columns of the segment's attitude
    // table, kept for the host.
    double* padfLineShiftB;
    double* padfLineShiftA;
    char Sensor[SRIT_SENSOR_SIZE];  // short sensor name of the chosen row
    int32_t nSensor;                // sensor code
    int32_t nModelClass;            // GetModel(nSensor)
    EphemerisSeg_t* psEphemeris;    // owned
    ProjInfo_t* psProjInfo;         // owned; projection of all ground coordinates
};

// ---------------------------------------------------------------------------
// Record management
// ---------------------------------------------------------------------------

// A zeroed record with a zeroed projection record and an empty segment (kind
// 0, no sub-record); both line arrays null.
LUMO_API SRITInfo_t* SRITAllocate();
// Makes psDst a deep copy of psSrc. Nothing happens when either is null or
// both are the same record. The line arrays are copied only when the source
// segment has an attitude table (kind 1, at least one line); otherwise the
// destination's are released and left null.
LUMO_API void SRITCopy(SRITInfo_t* psDst, const SRITInfo_t* psSrc);
// Releases a record with everything it owns. Null is ignored.
LUMO_API void LumoFreeSRITInfo(SRITInfo_t* psModel);
// Why a record cannot be evaluated, naming the field and its value; empty
// when it can: finite coefficients, c0 (twice the Earth's radius of
// curvature) within 1e7..1.5e7 m, non-zero divisors c2, c11, c12, c6 in
// (0, 1], a known form in anAux[SRIT_AUX_FORM], and a segment
// EphemerisSegValidate accepts. Every reader of a
// model file runs it.
LUMO_API std::string SRITValidate(const SRITInfo_t* psModel);

// ---------------------------------------------------------------------------
// Computation. (padfA, padfB) are image (pixel, line) and (padfC, padfD)
// ground (X, Y) when bImageFirst is true, the reverse when false; padfZ is
// the elevation. Returns 1 when a model was computed (the record then adopts
// psEphemeris), 0 otherwise (fewer than 3 points: nothing is touched).
// The equations take the form set in psModel->anAux[SRIT_AUX_FORM] (for
// SRITCalculateN, each image's record); an unknown form is error 11.
// Fatal numbered errors (thrown; the record is untouched and the segment
// stays the caller's): 32 for a projection that is not a conformal ground
// unit or a bad earth model, 19 for an unsupported sensor (also a sensor
// group none of whose rows matches), 100 for a null argument, a coordinate
// that is not finite or is LUMO_NULL_VALUE, or segment geometry from which
// no starting values follow. A sensor row asking for more than the model's
// 13 parameters adjusts all 13. The working storage belongs to the call:
// computations may run concurrently.
// ---------------------------------------------------------------------------

LUMO_API int SRITCalculate(SRITInfo_t* psModel, bool bImageFirst, EphemerisSeg_t* psEphemeris,
                           int nGCP, const ProjInfo_t* psProjInfo, const double* padfA,
                           const double* padfB, const double* padfZ, const double* padfC,
                           const double* padfD);
LUMO_API int SRITCalculate_imp(SRITInfo_t* psModel, bool bImageFirst, EphemerisSeg_t* psEphemeris,
                               int nGCP, const ProjInfo_t* psProjInfo, const double* padfA,
                               const double* padfB, const double* padfZ, const double* padfC,
                               const double* padfD);

// Block adjustment of up to SRIT_MAX_IMAGES images. Identifiers are
// SRIT_ID_SIZE characters each, back to back. Per control-point observation:
// its image, its point, a usage character ('A' adjusts, anything else is a
// check), the pairs (A, B) and (C, D) as for SRITCalculate, the elevation and
// the standard deviations (LUMO_NULL_VALUE = not given). Tie observations:
// image, point, pixel, line, elevation in/out, standard deviations, and the
// estimated ground X and Y out. The report lists the control points seen in
// more than one image; its arrays need room for one entry per distinct
// control point (at most nGCP) and may be null when not wanted, as may the
// tie X and Y outputs and every standard-deviation array. Every image needs
// its own record and segment. An observation naming an unknown image, a
// single tie observation, and more than SRIT_MAX_IMAGES images are fatal
// errors. Returns 1 when the models were computed, else 0 (fewer than 3
// control-point observations, or an image with fewer than 4 of them, 5 for
// radar).
LUMO_API int SRITCalculateN(
    int nImages, const char* pszImageIds, SRITInfo_t** papsModels, bool bImageFirst,
    EphemerisSeg_t** papsEphemeris, const ProjInfo_t* psProjInfo, int nGCP,
    const char* pszGcpImageIds, const char* pszGcpPointIds, const char* pszGcpUsage,
    const double* padfA, const double* padfB, const double* padfZ, const double* padfSdA,
    const double* padfSdB, const double* padfSdZ, const double* padfC, const double* padfD,
    const double* padfSdC, const double* padfSdD, int nTie, const char* pszTieImageIds,
    const char* pszTiePointIds, const double* padfTiePixel, const double* padfTieLine,
    double* padfTieZ, const double* padfTieSdPixel, const double* padfTieSdLine,
    const double* padfTieSdZ, double* padfTieX, double* padfTieY, int* pnReported,
    char* pszReportedIds, int* panReportedImages, double* padfGivenX, double* padfGivenY,
    double* padfGivenZ, double* padfEstimatedX, double* padfEstimatedY, double* padfEstimatedZ,
    double* padfResidualX, double* padfResidualY, double* padfResidualZ);

// ---------------------------------------------------------------------------
// Ground and image transforms. Ground coordinates are in the record's
// projection; LUMO_NULL_VALUE marks "no value".
// ---------------------------------------------------------------------------

// Ground (X, Y, elevation Z) to image pixel and line. For model class 6 the
// radar refinement must close to 10 ground units within its four rounds;
// otherwise both outputs are LUMO_NULL_VALUE.
LUMO_API void SRITGeo2Img(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ,
                          double* pdfPixel, double* pdfLine);
LUMO_API void SRITGeo2Img_imp(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ,
                              double* pdfPixel, double* pdfLine);
// Image to ground at elevation dfZ; 0 (outputs LUMO_NULL_VALUE) when dfZ is
// LUMO_NULL_VALUE, the model is missing its segment or the record gives no
// finite ground point. Ground to image likewise gives LUMO_NULL_VALUE for a
// position that is not finite.
LUMO_API int SRITImg2Geo_imp(const SRITInfo_t* psModel, double dfPixel, double dfLine, double dfZ,
                             double* pdfX, double* pdfY);
// Image to ground at *pdfZ (LUMO_NULL_VALUE is replaced by 0 and written
// back); returns what SRITImg2Geo_imp returns.
LUMO_API int SRITImg2GeoDem(const SRITInfo_t* psModel, double dfPixel, double dfLine, double* pdfZ,
                            double* pdfX, double* pdfY);
LUMO_API int SRITImg2GeoDem_imp(const SRITInfo_t* psModel, double dfPixel, double dfLine,
                                double* pdfZ, double* pdfX, double* pdfY);
// Ground to image with the fitted model, exactly inverting the image-to-ground
// equations (SRITImg2Geo_imp of the result gives back (dfX, dfY)): the
// equations are solved for the along- and across-track ground distances,
// then Newton steps on the image position stop when a step is below 1e-4
// pixel, leaving the answer within 1e-9 pixel of the exact solution; the
// level conversion follows as in SRITGeo2Img. The answer is verified: its
// forward projection must lie within 1e-3 pixel (through the local
// derivatives) of (dfX, dfY). Returns 1, or 0 (outputs LUMO_NULL_VALUE) for a
// null or empty model, a non-finite or null input, or an answer that fails
// the check. This is the form the tool and the math model object use;
// SRITGeo2Img keeps the closed form, which off nadir misses the equations by
// tenths of a pixel.
LUMO_API int SRITGeo2ImgExact(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ,
                              double* pdfPixel, double* pdfLine);
// Toutin's equations: ground to image, and centred image coordinates
// (dfXc = c4 - pixel, dfYc = line - c10) at an elevation to ground.
LUMO_API void toutin_imp(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ,
                         double* pdfPixel, double* pdfLine);
LUMO_API void toutin_1_imp(const SRITInfo_t* psModel, double dfXc, double dfYc, double dfZ,
                           double* pdfX, double* pdfY);

// ---------------------------------------------------------------------------
// Residuals: root mean square of the pixel and line differences between the
// model's projection of each ground point and its measured image position.
// ---------------------------------------------------------------------------

LUMO_API void SRITRMSError(const SRITInfo_t* psModel, int nGCP, const double* padfX,
                           const double* padfY, const double* padfZ, const double* padfPixel,
                           const double* padfLine, double& dfRmsPixel, double& dfRmsLine);
LUMO_API void SRITRMSError_imp(const SRITInfo_t* psModel, int nGCP, const double* padfX,
                               const double* padfY, const double* padfZ, const double* padfPixel,
                               const double* padfLine, double& dfRmsPixel, double& dfRmsLine);

// ---------------------------------------------------------------------------
// SPOT level 1A/1B conversion with the polynomial of the record's segment
// (nLevelConvForm 20 or 39; any other form leaves the coordinates as they
// are, as does a record without a segment). Pixel and line are in/out.
// A conversion that cannot give a finite result from finite input (a zero
// scale coefficient, a vanishing denominator) raises fatal numbered error 100
// naming the coefficient or the point; the coordinates are then unchanged.
// ---------------------------------------------------------------------------

// Raw (1A) geometry to resampled (1B) geometry.
LUMO_API void SPOT1ATo1B(const SRITInfo_t* psModel, double* pdfPixel, double* pdfLine);
LUMO_API void SPOT1ATo1B_imp(const SRITInfo_t* psModel, double* pdfPixel, double* pdfLine);
// Resampled (1B) geometry to raw (1A) geometry.
LUMO_API void SPOT1BTo1A(const SRITInfo_t* psModel, double* pdfPixel, double* pdfLine);
LUMO_API void SPOT1BTo1A_imp(const SRITInfo_t* psModel, double* pdfPixel, double* pdfLine);
// The control-point form of SPOT1BTo1A_imp: the segment of image nImage of
// papsEphemeris applies, and the per-line correction of "SPOT5" scenes is
// not made. A null array, a negative index or a null segment leaves the
// coordinates as they are.
LUMO_API void SPOT1BTo1AControlPoint_imp(const EphemerisSeg_t* const* papsEphemeris, int nImage,
                                         double* pdfPixel, double* pdfLine);
