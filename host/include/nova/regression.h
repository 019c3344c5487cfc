// Least-squares polynomial regression between two planes from control points,
// and the column-pivoted QR least-squares solver it shares with other fits.
#pragma once

// Largest polynomial order and the number of terms of the complete orders
// 1..5 (3, 6, 10, 15, 21).
constexpr int GCP_MAX_ORDER = 5;
constexpr int GCP_MAX_TERMS = 21;
constexpr int GCP_UNIT_LEN = 24;

// How a regression was actually fitted. A fit is lowered when the points do
// not determine the order asked for.
enum GCPFitKind {
    GCP_FIT_NONE = 0,        // never fitted (a zero-filled record)
    GCP_FIT_SHIFT = 1,       // all input points coincide: a translation
    GCP_FIT_SIMILARITY = 2,  // two points or collinear inputs: rotation, scale and shift
    GCP_FIT_POLYNOMIAL = 3,  // a complete polynomial of order nOrder
};

// A fitted regression (x, y) -> (X, Y): two bivariate polynomials, one per
// output coordinate. A plain record without pointers: callers allocate it
// uninitialised or zero-filled, copy it by value and free it with free().
//
// Term k of the input pair (u, v), k < 21:
//   1, u, v, uv, u², v², u²v, uv², u³, v³, u²v², u³v, uv³, u⁴, v⁴,
//   u³v², u²v³, u⁴v, uv⁴, u⁵, v⁵.
struct GEOInfo_t {
    int nOrder;    // polynomial order in effect, 1..5 (0 when never fitted)
    int nTerms;    // terms in use: 3, 6, 10, 15 or 21
    int nFitKind;  // GCPFitKind
    int nPoints;   // number of control points of the fit
    // Coefficients in the raw input coordinates: X = sum adfXCoeffs[k] * term k (x, y).
    // The first three are the constant and the factors of x and y.
    double adfXCoeffs[GCP_MAX_TERMS];
    double adfYCoeffs[GCP_MAX_TERMS];
    // The same polynomials in normalised coordinates, used for evaluation:
    // u = (x - dfInXOffset) / dfInXScale, v = (y - dfInYOffset) / dfInYScale,
    // X = dfOutXOffset + dfOutXScale * sum adfNormXCoeffs[k] * term k (u, v).
    double adfNormXCoeffs[GCP_MAX_TERMS];
    double adfNormYCoeffs[GCP_MAX_TERMS];
    double dfInXOffset;
    double dfInYOffset;
    double dfInXScale;
    double dfInYScale;
    double dfOutXOffset;
    double dfOutYOffset;
    double dfOutXScale;
    double dfOutYScale;
    // Unit names of the two coordinate pairs (empty when not given).
    char szFromUnit[GCP_UNIT_LEN];
    char szToUnit[GCP_UNIT_LEN];
    // First-order fit of the same points in raw coordinates:
    // X = a0 + a1 x + a2 y, Y = a3 + a4 x + a5 y.
    double adfAffine[6];
};

// Fits the regression from the n points (x1, y1) to (x2, y2).
// options: null, or options[0] = the polynomial order 1..5 (null: order 1);
// no other slot is read. work1 and work2 are accepted for callers that pass
// scratch arrays; they are never read or written, so any number of points
// may be fitted. When the points do not determine the order asked for, the
// fit is lowered (warning 100): to the highest complete order they determine,
// then to a similarity transform (two points, or collinear inputs), then to a
// shift (one point, or all inputs at one place). Returns 0 on success. Null
// arrays, n < 1, non-finite coordinates or an order outside 1..5 raise fatal
// error 100 (which throws) and leave *psInfo unchanged.
int GCPRegression(GEOInfo_t* psInfo, double* x1, double* y1, double* x2, double* y2, int n,
                  int* options, double* work1, double* work2);

// As GCPRegression, with the unit names of the two pairs stored in the record
// (null: empty; longer names are truncated) and the order by pointer: *order
// (null: 1) is read and the order actually fitted is written back. nFlag is
// reserved: callers pass 0, other values are treated alike. When given,
// *pdfRmsX and *pdfRmsY receive the root-mean-square residuals of the fit.
int GCPRegression2(GEOInfo_t* psInfo, const char* fromUnit, double* x1, double* y1,
                   const char* toUnit, double* x2, double* y2, int n, int* order, int nFlag,
                   double* pdfRmsX, double* pdfRmsY);

// Evaluates a fitted regression at (x, y). Returns 0 on success; -1, with
// both outputs 0, when the record holds no valid fit or (x, y) is not finite.
int GCPTransform(const GEOInfo_t* psInfo, double x, double y, double* outX, double* outY);

// Root-mean-square residuals sqrt(sum (f(x1, y1) - (x2, y2))² / n) of a fitted
// regression over n points; 0 and 0 for n = 0. Returns 0. A record without a
// valid fit, null arrays or outputs, or n < 0 raise fatal error 100.
int GCPRootMeanSq(GEOInfo_t* psInfo, double* x1, double* y1, double* x2, double* y2, int n,
                  double* rmsX, double* rmsY);

// Failure indicators of dqrlsc.
enum DqrlscStatus {
    DQRLSC_OK = 0,
    DQRLSC_BAD_ARGUMENT = 1,  // null array, n < 1, lda < n, tol negative or not finite,
                              // task neither -1 nor 2
    DQRLSC_RANK_ZERO = 2,     // the matrix is zero (or |R00| is not above 0)
    DQRLSC_NO_FACTOR = 3,     // task 2 without a factorisation in A, qraux and jpvt
    DQRLSC_NOT_FINITE = 4,    // A or b holds a NaN or an infinity
};

// Least squares A x = b for the n x n matrix A, column-major with leading
// dimension lda >= n, by Householder QR with column pivoting.
// task -1: factorises A in place and solves. Afterwards A holds R in its upper
//   triangle and the Householder vectors below the diagonal (unit leading
//   entry implied), qraux[k] the reflector factors (each 0 or in [1, 2]) and
//   jpvt[k] the original (0-based) index of the k-th pivot column. The rank
//   is the number of leading k with |R_kk| > tol * |R_00|.
// task 2: solves for a new b with the factorisation that a task -1 call left
//   in A, qraux and jpvt; the rank is re-determined from R's diagonal and tol.
// x receives the basic solution (0 for the columns beyond the rank), rsd (may
// be null) the residual b - A x of the original matrix. work is accepted for
// callers that pass scratch space and is never touched (may be null): the
// working storage belongs to the call. *rank receives the rank (0 on any
// failure) and *ind a DqrlscStatus; on failure x and rsd are unchanged, and A
// is unchanged unless the status is DQRLSC_RANK_ZERO.
void dqrlsc(double* A, int lda, int n, double tol, int* rank, double* b, double* x, double* rsd,
            int* jpvt, double* qraux, double* work, int task, int* ind);
