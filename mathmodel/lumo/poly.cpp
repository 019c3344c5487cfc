// Polynomial model: allocation, copy, release and evaluation in both
// directions.
#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "errors.h"
#include "lumo_poly.h"
#include "projection.h"
#include "record_check.h"
#include "runtime.h"

namespace {

bool IsCompleteOrder(int nCoeffs) {
    return nCoeffs == 3 || nCoeffs == 6 || nCoeffs == 10 || nCoeffs == 15 || nCoeffs == 21;
}

// Nested evaluation of a complete polynomial (3, 6, 10, 15 or 21 terms),
// grouped by powers of v and u to save multiplications.
double EvaluateComplete(const double* c, int nCoeffs, double u, double v) {
    switch (nCoeffs) {
        case 3:
            return c[0] + c[1] * u + c[2] * v;
        case 6:
            return c[0] + (c[3] * u + c[2] + c[5] * v) * v + (c[4] * u + c[1]) * u;
        case 10:
            return c[0] + ((c[6] * u + c[3]) * u + c[2] + (c[7] * u + c[5] + c[9] * v) * v) * v +
                   ((c[8] * u + c[4]) * u + c[1]) * u;
        case 15:
            return c[0] +
                   (((c[11] * u + c[6]) * u + c[3]) * u + c[2] +
                    ((c[10] * u + c[7]) * u + c[5] + (c[12] * u + c[9] + c[14] * v) * v) * v) *
                       v +
                   (((c[13] * u + c[8]) * u + c[4]) * u + c[1]) * u;
        default:  // 21
            return c[0] +
                   ((((c[17] * u + c[11]) * u + c[6]) * u + c[3]) * u + c[2] +
                    (((c[15] * u + c[10]) * u + c[7]) * u + c[5] +
                     (((c[16] * u + c[12]) * u + c[9]) + (c[18] * u + c[14] + c[20] * v) * v) * v) *
                        v) *
                       v +
                   ((((c[19] * u + c[13]) * u + c[8]) * u + c[4]) * u + c[1]) * u;
    }
}

// Term k of (u, v) in the model's term order.
double Term(int k, double u, double v) {
    const double u2 = u * u;
    const double v2 = v * v;
    switch (k) {
        case 0:
            return 1.0;
        case 1:
            return u;
        case 2:
            return v;
        case 3:
            return u * v;
        case 4:
            return u2;
        case 5:
            return v2;
        case 6:
            return u2 * v;
        case 7:
            return u * v2;
        case 8:
            return u2 * u;
        case 9:
            return v2 * v;
        case 10:
            return u2 * v2;
        case 11:
            return u2 * u * v;
        case 12:
            return u * v2 * v;
        case 13:
            return u2 * u2;
        case 14:
            return v2 * v2;
        case 15:
            return u2 * u * v2;
        case 16:
            return u2 * v2 * v;
        case 17:
            return u2 * u2 * v;
        case 18:
            return u * v2 * v2;
        case 19:
            return u2 * u2 * u;
        default:
            return v2 * v2 * v;  // 20
    }
}

// Incomplete term counts: the constant first, then the terms from the highest
// index in use down to index 1.
double EvaluateTermByTerm(const double* c, int nTerms, double u, double v) {
    double dfSum = c[0];
    for (int k = nTerms - 1; k >= 1; --k) dfSum += c[k] * Term(k, u, v);
    return dfSum;
}

double Evaluate(const double* c, int nCoeffs, double u, double v) {
    if (IsCompleteOrder(nCoeffs)) return EvaluateComplete(c, nCoeffs, u, v);
    const int nTerms = std::min(nCoeffs, POLY_MAX_COEFFS);
    if (nTerms <= 1) return c[0];
    return EvaluateTermByTerm(c, nTerms, u, v);
}

// Term count that is valid for evaluation; warns when the record's is not.
int UsableTermCount(int nCoeffs) {
    if (nCoeffs < 1 || nCoeffs > POLY_MAX_COEFFS) lumo::WarnMsg(lumo::Err::kBadArgument);
    if (nCoeffs > POLY_MAX_COEFFS) return POLY_MAX_COEFFS;
    return nCoeffs;
}

// Null records and outputs are reported and the call does nothing.
bool CanEvaluate(const POLYInfo_t* psPoly, const double* pdfOut1, const double* pdfOut2) {
    if (psPoly && psPoly->padfPixelCoeffs && psPoly->padfLineCoeffs && psPoly->padfXCoeffs &&
        psPoly->padfYCoeffs && pdfOut1 && pdfOut2) {
        return true;
    }
    lumo::Warn(lumo::Err::kBadArgument, _("Polynomial model or output pointer is null."));
    return false;
}

void CopyCoefficients(double* padfDst, const double* padfSrc, std::size_t nBytes) {
    if (padfDst && padfSrc && nBytes > 0) std::memcpy(padfDst, padfSrc, nBytes);
}

double* AllocateCoefficients() {
    return static_cast<double*>(HCalloc(POLY_MAX_COEFFS, sizeof(double)));
}

}  // namespace

POLYInfo_t* POLYAllocate() {
    auto* psPoly = static_cast<POLYInfo_t*>(HCalloc(1, sizeof(POLYInfo_t)));
    psPoly->padfPixelCoeffs = AllocateCoefficients();
    psPoly->padfLineCoeffs = AllocateCoefficients();
    psPoly->padfXCoeffs = AllocateCoefficients();
    psPoly->padfYCoeffs = AllocateCoefficients();
    psPoly->pszGeosys = static_cast<char*>(HCalloc(POLY_GEOSYS_SIZE, 1));
    psPoly->psProjInfo = static_cast<ProjInfo_t*>(HCalloc(1, sizeof(ProjInfo_t)));
    InitProjInfo(psPoly->psProjInfo, 0);
    return psPoly;
}

void POLYCopy(POLYInfo_t* psDst, const POLYInfo_t* psSrc) {
    if (!psDst || !psSrc || psDst == psSrc) return;
    // The arrays hold 21 coefficients whatever the source claims: clamp the
    // count used to size the copy so a damaged record cannot overrun them.
    const int nCopy = std::clamp(psSrc->nCoeffs, 0, POLY_MAX_COEFFS);
    psDst->nCoeffs = psSrc->nCoeffs;
    psDst->nLines = psSrc->nLines;
    psDst->nPixels = psSrc->nPixels;
    if (psDst->psProjInfo && psSrc->psProjInfo) *psDst->psProjInfo = *psSrc->psProjInfo;
    if (psDst->pszGeosys && psSrc->pszGeosys) {
        std::memcpy(psDst->pszGeosys, psSrc->pszGeosys, POLY_GEOSYS_SIZE - 1);
        psDst->pszGeosys[POLY_GEOSYS_SIZE - 1] = '\0';
    }
    const std::size_t nBytes = static_cast<std::size_t>(nCopy) * sizeof(double);
    CopyCoefficients(psDst->padfPixelCoeffs, psSrc->padfPixelCoeffs, nBytes);
    CopyCoefficients(psDst->padfLineCoeffs, psSrc->padfLineCoeffs, nBytes);
    CopyCoefficients(psDst->padfXCoeffs, psSrc->padfXCoeffs, nBytes);
    CopyCoefficients(psDst->padfYCoeffs, psSrc->padfYCoeffs, nBytes);
}

void POLYDeallocate(POLYInfo_t* psPoly) {
    if (!psPoly) return;
    std::free(psPoly->psProjInfo);
    std::free(psPoly->pszGeosys);
    std::free(psPoly->padfPixelCoeffs);
    std::free(psPoly->padfLineCoeffs);
    std::free(psPoly->padfXCoeffs);
    std::free(psPoly->padfYCoeffs);
    std::free(psPoly);
}

std::string POLYValidate(const POLYInfo_t* psPoly) {
    if (psPoly == nullptr || psPoly->padfPixelCoeffs == nullptr ||
        psPoly->padfLineCoeffs == nullptr || psPoly->padfXCoeffs == nullptr ||
        psPoly->padfYCoeffs == nullptr) {
        return "the record or its coefficient arrays are null";
    }
    const int n = psPoly->nCoeffs;
    if (n < 1 || n > POLY_MAX_COEFFS) {
        return lumo::FieldProblem("nCoeffs", n, "the model has 1 to 21 terms");
    }
    std::string problem = lumo::FirstNonFinite("padfPixelCoeffs", psPoly->padfPixelCoeffs, n);
    if (problem.empty())
        problem = lumo::FirstNonFinite("padfLineCoeffs", psPoly->padfLineCoeffs, n);
    if (problem.empty()) problem = lumo::FirstNonFinite("padfXCoeffs", psPoly->padfXCoeffs, n);
    if (problem.empty()) problem = lumo::FirstNonFinite("padfYCoeffs", psPoly->padfYCoeffs, n);
    return problem;
}

void POLYGeo2Img(const POLYInfo_t* psPoly, double dfX, double dfY, double* pdfPixel,
                 double* pdfLine) {
    if (!CanEvaluate(psPoly, pdfPixel, pdfLine)) return;
    const int nTerms = UsableTermCount(psPoly->nCoeffs);
    *pdfPixel = Evaluate(psPoly->padfPixelCoeffs, nTerms, dfX, dfY);
    *pdfLine = Evaluate(psPoly->padfLineCoeffs, nTerms, dfX, dfY);
}

void POLYImg2Geo(const POLYInfo_t* psPoly, double dfPixel, double dfLine, double* pdfX,
                 double* pdfY) {
    if (!CanEvaluate(psPoly, pdfX, pdfY)) return;
    const int nTerms = UsableTermCount(psPoly->nCoeffs);
    *pdfX = Evaluate(psPoly->padfXCoeffs, nTerms, dfPixel, dfLine);
    *pdfY = Evaluate(psPoly->padfYCoeffs, nTerms, dfPixel, dfLine);
}
