// Internal interface of the rigorous model's implementation: the working
// records of one adjustment and the steps that the one-image and the block
// computations share. The exported entry points (sritcalc.cpp,
// sritcalc_imp.cpp) call into these.
//
// Everything here belongs to one call: images, points and the normal
// equations live in containers of the call's Adjustment, so a fatal error
// (which throws) releases them and computations may run side by side.
#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

#include "lumo_ephemeris.h"
#include "lumo_srit.h"
#include "projection.h"
#include "srit/model_terms.h"

namespace lumo {
namespace srit {

constexpr int kIterations = 7;
constexpr double kEarthRate = 7.292115841e-5;  // rad/s
constexpr double kNull = LUMO_NULL_VALUE;

// Position of each parameter in an image's block of the unknown vector.
// Optical layout: P0 ... P12 at positions 0 ... 12. Radar layout: P12 moves to
// position 8 and P8 ... P11 follow it.
constexpr int kOpticalPosition[kMaxUnknowns] = {0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12};
constexpr int kRadarPosition[kMaxUnknowns] = {0, 1, 2, 3, 4, 5, 6, 7, 9, 10, 11, 12, 8};

struct Ellipsoid {
    double dfSemiMajor = 0.0;
    double dfEcc2 = 0.0;  // squared eccentricity
};

// Sensor set-up of one image: how many unknowns it gets and how it weighs.
struct ImageSetup {
    int nUnknowns = 0;
    double dfWeightFactor = 0.0;
    double dfAccuracy = 0.0;  // metres
    char szShortName[SRIT_SENSOR_SIZE + 1] = {};
    int nSensor = 0;
};

// One image of the adjustment: its segment, set-up, and its model (the
// parameters with the fixed and derived values) in ModelTerms.
struct ImageState {
    const EphemerisSeg_t* psSeg = nullptr;
    ImageSetup sSetup;
    bool bRadar = false;
    bool bFlat = false;  // TM, ETM, IKONOS, L2: no Earth-curvature term, flat starting values
    bool bConstrained = false;
    int nObservations = 0;      // control-point observations, used and check
    int nUsedObservations = 0;  // those that enter the adjustment
    int nBlockStart = 0;        // first position of the image's block in the unknown vector
    ModelTerms sTerms;
    double adfStart[kMaxUnknowns] = {};  // starting values (P3 ... P7 used)
    double dfGeocLat = 0.0;              // geocentric latitude of the scene centre
    double adfAttitude[3] = {};

    const int* Positions() const { return bRadar ? kRadarPosition : kOpticalPosition; }
};

// One observation of a point in one image.
struct PointSlot {
    int nFlag = 0;  // 0 not observed, 1 used, 2 check
    double dfPixel = 0.0, dfLine = 0.0;
    double dfSdPixel = kNull, dfSdLine = kNull;  // recorded only
    double dfXc = 0.0, dfYc = 0.0;               // centre column - pixel, line - centre line
};

// One control point (or, with several images, tie point).
struct PointRecord {
    char cType = 'X';  // X full control, P no elevation, A tie with elevation, H tie
    int nInUse = 0;
    double dfX = 0.0, dfY = 0.0, dfZ = 0.0;
    double dfSdX = kNull, dfSdY = kNull, dfSdZ = kNull;
    double dfEstX = 0.0, dfEstY = 0.0, dfEstZ = 0.0;
    double dfResX = 0.0, dfResY = 0.0, dfResZ = 0.0;
    std::vector<PointSlot> asSlots;  // one per image
};

// Upper triangle of the augmented (N+1)x(N+1) normal matrix, packed row by
// row; the last column holds the misclosure terms.
class NormalEquations {
  public:
    explicit NormalEquations(int nUnknowns);

    int Unknowns() const { return m_nSize - 1; }
    void Clear();
    double* Row() { return m_adfRow.data(); }  // coefficients, set by the caller
    void ClearRow();

    // Adds the row set in Row() with misclosure l (computed - observed) and
    // weight w (1 / standard deviation): element (r, c) gains g_r g_c.
    void AddRow(double dfMisclosure, double dfWeight);

    // In-place Cholesky factorisation of the augmented matrix and back
    // substitution; x solves (sum w^2 a a^T) x = -(sum w^2 a l). False, with
    // x left zero, when a pivot is not positive.
    bool Solve(double* pdfX);

  private:
    std::size_t Offset(int r) const {
        return static_cast<std::size_t>(r) * m_nSize - static_cast<std::size_t>(r) * (r - 1) / 2;
    }
    int m_nSize;
    std::vector<double> m_adf;
    std::vector<double> m_adfRow;
    std::vector<double> m_adfScale;
    std::vector<int> m_anNonZero;
};

// Packed normal equations for nUnknowns unknowns; sizes the machine cannot
// hold are a fatal error rather than a crash.
std::unique_ptr<NormalEquations> MakeNormalEquations(int nUnknowns);

// Two images whose viewing angles differ enough to intersect their rays.
struct ImagePair {
    std::size_t i = 0, j = 0;  // i < j
    double dfDiff = 0.0;       // |tan(view angle i) - tan(view angle j)|
};

// Parameter constraint weights (one set for the adjustment).
struct ConstraintWeights {
    double W3 = 0.0, W4 = 0.0, W5 = 0.0, W6 = 0.0, W7 = 0.0;
};

// The working state of one computation.
struct Adjustment {
    Ellipsoid sEllipsoid;
    std::vector<ImageState> asImages;
    std::vector<PointRecord> asPoints;
    ConstraintWeights sWeights;
    double dfMinControlWeight = 0.0;  // smallest control row weight of an iteration
    double dfLastRowWeight = 0.0;     // weight of the observation row added last
    std::vector<ImagePair> asPairs;   // empty for one image
};

// Moving a ground point's elevation by dZ moves the ground position derived
// from its measurement at centred pixel xc by (ax, ay) * dZ.
struct Displacement {
    double ax = 0.0, ay = 0.0;
};

// ---------------------------------------------------------------------------
// Level 1A/1B conversion (level_conversion.cpp). Forms other than 20 and 39
// leave the coordinates unchanged; a finite point that does not convert to a
// finite one is a fatal error and changes nothing. A null segment or
// coordinate changes nothing.
// ---------------------------------------------------------------------------

void ConvertTo1B(const EphemerisSeg_t* psSeg, double* pdfPixel, double* pdfLine);
void ConvertTo1A(const EphemerisSeg_t* psSeg, double* pdfPixel, double* pdfLine);
// The control-point form: no per-line correction of "SPOT5" scenes.
void ConvertControlPointTo1A(const EphemerisSeg_t* psSeg, double* pdfPixel, double* pdfLine);

// ---------------------------------------------------------------------------
// Sensor set-up and segment values (sensor_setup.cpp)
// ---------------------------------------------------------------------------

bool ShortNameContains(const ImageSetup& sSetup, const char* pszText);
// Sensors whose image coordinates go through the level 1A/1B conversion.
bool IsLevelSensor(int nSensor);
// The elevation terms need at least two different elevations among the
// first nControlPoints points.
void SpreadElevations(Adjustment& sAdj, std::size_t nControlPoints);
// Segment values, sensor rows, block positions and centred image coordinates.
void PrepareImages(Adjustment& sAdj);

// ---------------------------------------------------------------------------
// Equations of the adjustment (equations.cpp; the image <-> ground equations
// are declared in model_terms.h)
// ---------------------------------------------------------------------------

// Partial derivatives of the X row (bXRow) or the Y row of a measurement
// whose image-to-ground terms are s, by parameter P0 ... P12.
void ObservationCoefficients(const ModelTerms& m, const GroundTerms& s, bool bXRow,
                             double* pdfCoef);
Displacement DisplacementOf(const ModelTerms& m, double xc);
// Writes image k's coefficients (by parameter) into its block of the row;
// positions beyond the image's unknown count are not written.
void WriteBlock(const Adjustment& sAdj, std::size_t k, const double* pdfCoef, double* pdfRow);
// Start of image k's block in the unknown vector.
inline int BlockStart(const Adjustment& sAdj, std::size_t k) {
    return sAdj.asImages[k].nBlockStart;
}

// ---------------------------------------------------------------------------
// Observation rows and constraints (observations.cpp)
// ---------------------------------------------------------------------------

// Observation rows of every point in use: control rows, then the rows that
// bind the images of a block together.
void AddObservationRows(Adjustment& sAdj, NormalEquations& sNormal);
// Pseudo-observations that hold P3 ... P7 near their starting values.
void AddConstraintRows(const Adjustment& sAdj, NormalEquations& sNormal);

// ---------------------------------------------------------------------------
// Starting values (starting_values.cpp)
// ---------------------------------------------------------------------------

// Starting values of P0 ... P12 from the orbit and viewing geometry, image by
// image, and the constraint weights.
void ComputeStartingValues(Adjustment& sAdj);

// ---------------------------------------------------------------------------
// Ground positions of points from several images (intersection.cpp)
// ---------------------------------------------------------------------------

// Tie points and control points without elevation.
bool IsTieOrNoElevation(const PointRecord& sPoint);
// Elevations of the points without one: first (bFirst) the mean elevation of
// the points that have one, then the intersection of their measurements in
// two or more images.
void EstimateElevations(Adjustment& sAdj, bool bFirst);
// Ground estimate and residuals (given minus estimated) of every point from
// its used measurements.
void EstimatePoints(Adjustment& sAdj);

// ---------------------------------------------------------------------------
// The adjustment (adjustment.cpp)
// ---------------------------------------------------------------------------

[[noreturn]] void ReportNullArgument(const char* pszName);
// Whether the record asks for the curved-incidence form (SRIT_AUX_FORM);
// error 11 naming the record and the value for an unknown form.
bool CurvedIncidenceAsked(const SRITInfo_t& sModel, const char* pszRecord);
inline void RequireArgument(const void* pv, const char* pszName) {
    if (pv == nullptr) ReportNullArgument(pszName);
}
// Decodes the projection into pszDecoded; prints the described lines and
// raises error 32 when it is not a conformal ground unit.
void RequireConformal(const ProjInfo_t& sProj, char* pszDecoded);
// Ellipsoid of the control points' projection (error 32 for a bad one).
Ellipsoid EllipsoidOf(const ProjInfo_t& sProj, const char* pszDecoded);
// Starting values, first elevations, the iterations, and a check that every
// image's parameters stayed numbers.
void Adjust(Adjustment& sAdj, const char* pszFunction);
// Writes an image's result into its model record, which adopts the segment.
void FillRecord(const ImageState& sImg, SRITInfo_t* psModel, EphemerisSeg_t* psEphemeris,
                const ProjInfo_t& sProj);
// The one-image computation behind SRITCalculate_imp.
int CalculateOne(SRITInfo_t* psModel, bool bImageFirst, EphemerisSeg_t* psEphemeris, int nGCP,
                 const ProjInfo_t* psProjInfo, const double* padfA, const double* padfB,
                 const double* padfZ, const double* padfC, const double* padfD);

}  // namespace srit
}  // namespace lumo

// The multi-image computation behind SRITCalculateN; internal to the
// library (not exported, and not in the installed headers).
int SRITCalculateMulti(int nImages, const char* pszImageIds, SRITInfo_t** papsModels,
                       bool bImageFirst, EphemerisSeg_t** papsEphemeris,
                       const ProjInfo_t* psProjInfo, int nGCP, const char* pszGcpImageIds,
                       const char* pszGcpPointIds, const char* pszGcpUsage, const double* padfA,
                       const double* padfB, const double* padfZ, const double* padfSdA,
                       const double* padfSdB, const double* padfSdZ, const double* padfC,
                       const double* padfD, const double* padfSdC, const double* padfSdD, int nTie,
                       const char* pszTieImageIds, const char* pszTiePointIds,
                       const double* padfTiePixel, const double* padfTieLine, double* padfTieZ,
                       const double* padfTieSdPixel, const double* padfTieSdLine,
                       const double* padfTieSdZ, double* padfTieX, double* padfTieY,
                       int* pnReported, char* pszReportedIds, int* panReportedImages,
                       double* padfGivenX, double* padfGivenY, double* padfGivenZ,
                       double* padfEstimatedX, double* padfEstimatedY, double* padfEstimatedZ,
                       double* padfResidualX, double* padfResidualY, double* padfResidualZ);
