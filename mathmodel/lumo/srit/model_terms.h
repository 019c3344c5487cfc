// One vocabulary for the rigorous model's equations. The adjustment works on
// the unknowns P0 ... P12 of an image; a computed record stores them, with
// fixed and derived values, as the coefficients c0 ... c22. Both give the
// same view, ModelTerms, on which the image <-> ground equations are written
// once (equations.cpp). The table that places each parameter in the record
// is here and nowhere else.
#pragma once

#include "lumo_srit.h"

namespace lumo {
namespace srit {

constexpr int kMaxUnknowns = 13;  // P0 ... P12 per image

// The parameters of one image, as indices of ModelTerms::P. P3 and P6 are
// updated relatively (multiplied by 1 + correction), the others additively.
enum Param : int {
    kCentreX = 0,          // P0: ground X of the scene centre
    kCentreY = 1,          // P1: ground Y of the scene centre
    kRotation = 2,         // P2: angle from the ground axes to the image axes (radians)
    kAcrossScale = 3,      // P3: ground distance per unit of across-track angle
    kAcrossTilt = 4,       // P4: tangent of the corrected viewing angle
    kShear = 5,            // P5: along-track shear
    kLineSpacing = 6,      // P6: ground distance per image line
    kAlongTilt = 7,        // P7: tangent of the corrected pitch
    kShearAlong = 8,       // P8: change of the shear along track
    kShearAcross = 9,      // P9: change of the shear across track
    kLineAcross = 10,      // P10: change of the line scale across track
    kLineSquare = 11,      // P11: square term along track
    kElevationAcross = 12  // P12: elevation-dependent across-track term
};

// The stored coefficients, as indices of SRITInfo_t::adfCoef.
enum Coef : int {
    kCoefTwoN = 0,              // c0: twice the normal radius of curvature at the centre (m)
    kCoefShear = 1,             // c1 = P5
    kCoefIfov = 2,              // c2: angle of one pixel across track (segment's dfIFOV)
    kCoefShearAlong = 3,        // c3 = P8
    kCoefCentreColumn = 4,      // c4
    kCoefShearAcross = 5,       // c5 = P9
    kCoefCosAlongTilt = 6,      // c6 = cos(atan(P7))
    kCoefLineAcross = 7,        // c7 = P10
    kCoefRotation = 8,          // c8 = P2
    kCoefDisplacement = 9,      // c9 = (P4^2 + 1) / (P3 c6) + 2 (c15^2 + 1) / c0
    kCoefCentreLine = 10,       // c10
    kCoefLineSpacing = 11,      // c11 = P6
    kCoefAcrossScale = 12,      // c12 = P3
    kCoefAlongTilt = 13,        // c13 = P7
    kCoefAcrossTilt = 14,       // c14 = P4
    kCoefTiltRatio = 15,        // c15 = P4 / c6
    kCoefCentreX = 16,          // c16 = P0
    kCoefCentreY = 17,          // c17 = P1
    kCoefElevationAcross = 18,  // c18 = P12
    kCoefLineSquare = 19,       // c19 = P11
    kCoefLineCube = 20,         // c20: class-5 cubic line term; 0 from every computation
    kCoefAcrossCube = 21,       // c21: class-5/6 cubic across-track term; 0 likewise
    kCoefElevationLine = 22     // c22: class-5 elevation-by-line term; 0 likewise
};

// Where each parameter is stored: adfCoef[kCoefOfParam[p]] holds P[p].
constexpr int kCoefOfParam[kMaxUnknowns] = {
    kCoefCentreX,    kCoefCentreY,     kCoefRotation,       kCoefAcrossScale, kCoefAcrossTilt,
    kCoefShear,      kCoefLineSpacing, kCoefAlongTilt,      kCoefShearAlong,  kCoefShearAcross,
    kCoefLineAcross, kCoefLineSquare,  kCoefElevationAcross};

// Model classes (GetModel) with equations of their own.
constexpr int kClassNoCurvature = 2;  // no Earth-curvature term in the elevation
constexpr int kClassCubic = 5;        // the extra terms c20, c21, c22
constexpr int kClassRadarLike = 6;    // cubic across-track term and a refined inverse

// Sensor codes with equations or conversions of their own.
constexpr int kSensorPla = 0;           // per-line table and level conversion
constexpr int kSensorMla = 1;           // per-line table and level conversion
constexpr int kSensorTm = 30;           // linear form
constexpr int kSensorEtm = 31;          // linear form
constexpr int kSensorFormosatPan = 50;  // lens distortion
constexpr int kSensorSpot5Pan25 = 54;   // level conversion
constexpr int kSensorSpot5Pan5 = 55;    // level conversion
constexpr int kSensorSpot5Multi = 57;   // level conversion

// Which terms of the equations apply.
struct Selectors {
    // Image to ground: the per-line shifts replace the second-order and
    // elevation terms (the adjustment's linear group; stored PLA, MLA, TM,
    // ETM models).
    bool bLinear = false;
    bool bCubicClass = false;    // class 5
    bool bRadarLike = false;     // class 6
    bool bCurvature = true;      // the elevation loses u^2 / c0
    bool bElevationTerm = true;  // the P12 term of the general form
    bool bLens = false;          // lens distortion of the FORMOSAT panchromatic camera
    // The elevation scale grows with the incidence angle's tangent
    // (SRIT_FORM_CURVED_INCIDENCE) rather than only with the curvature.
    bool bCurvedIncidence = false;
};

// The model of one image in the parameters' vocabulary.
struct ModelTerms {
    double P[kMaxUnknowns] = {};
    double dfTwoN = 0.0;           // c0
    double dfIfov = 0.0;           // c2
    double dfCentreColumn = 0.0;   // c4
    double dfCentreLine = 0.0;     // c10
    double dfCosAlongTilt = 0.0;   // c6
    double dfDisplacement = 0.0;   // c9
    double dfTiltRatio = 0.0;      // c15
    double dfLineCube = 0.0;       // c20
    double dfAcrossCube = 0.0;     // c21
    double dfElevationLine = 0.0;  // c22
    Selectors sSelect;
    // Per-line shifts (dfValue2 across, dfValue1 along) by line l counted
    // from 1, l = trunc(yc + centre line + dfLineRounding); null when none
    // apply.
    const AttitudeData_t* psLineTable = nullptr;
    double dfLineRounding = 0.0;
    int nLines = 0;  // image lines: bounds the per-line lookup of ground to image

    // c6, c15 and c9 from P3, P4 and P7.
    void UpdateDerived();
    // k of the elevation scale (1 - 2 k Z / c0): c15^2 + 1 in the
    // curved-incidence form, 1 in the classic one.
    double ElevationScaleRate() const {
        return sSelect.bCurvedIncidence ? dfTiltRatio * dfTiltRatio + 1.0 : 1.0;
    }
};

// The view of a computed record, and the coefficients of a view.
ModelTerms TermsOfRecord(const SRITInfo_t& sModel);
void StoreTerms(const ModelTerms& sTerms, double* padfCoef);

// The terms of the image-to-ground equations of one measurement and the
// ground position they give.
struct GroundTerms {
    double t = 0.0;  // along-track ground distance
    double u = 0.0;  // across-track ground distance
    double H = 0.0;  // elevation less the curvature drop
    double Z = 0.0;  // the elevation itself
    // Only where the P12 term applies (always in the adjustment): the
    // obliquity gain of the elevation term and H^2 / (2 P3) + H.
    double g = 0.0;
    double K = 0.0;
    // The ground offset from the scene centre on the image's axes (across
    // and along track), and the ground position it gives.
    double dfAcross = 0.0, dfAlong = 0.0;
    double dfX = 0.0, dfY = 0.0;
};

// Across-track ground distance u and obliquity gain g at centred pixel xc.
double AcrossDistance(const ModelTerms& m, double xc);
double ObliquityGain(const ModelTerms& m, double xc);

// Image (centred coordinates xc = centre column - pixel, yc = line - centre
// line) to ground at elevation Z.
GroundTerms ImageToGround(const ModelTerms& m, double xc, double yc, double Z);
// The same up to the image's axes: dfAcross and dfAlong are set, dfX and
// dfY are not.
GroundTerms ImageToAxes(const ModelTerms& m, double xc, double yc, double Z);
// Ground to image pixel and line, the approximate inverse of ImageToGround.
void GroundToImage(const ModelTerms& m, double dfX, double dfY, double dfZ, double* pdfPixel,
                   double* pdfLine);
// The ground offset from the scene centre on the image's axes (across and
// along track), and the closed form from those offsets on: GroundToImage is
// the two in turn.
void GroundToAxes(const ModelTerms& m, double dfX, double dfY, double* pdfAcross, double* pdfAlong);
void AxesToImage(const ModelTerms& m, double dfAcross, double dfAlong, double dfZ, double* pdfPixel,
                 double* pdfLine);
// Ground to image pixel and line as the exact inverse of ImageToGround:
// chord steps on the image position from a start solved on the ground axes,
// until a step is below 1e-4 pixel (the answer, with that step, is within
// 1e-9 pixel of the exact solution). The answer is accepted only when its
// forward projection, its miss taken to pixels through the derivatives at
// the answer, lies within the inverse tolerance of (dfX, dfY); false
// (outputs untouched) otherwise.
bool GroundToImageExact(const ModelTerms& m, double dfX, double dfY, double dfZ, double* pdfPixel,
                        double* pdfLine);

}  // namespace srit
}  // namespace lumo
