// Transform container: allocates the model of a kind, routes fits,
// evaluations and residuals to it and keeps the fitted flag.
#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <memory>
#include <vector>

#include "errors.h"
#include "lumo_ephemeris.h"
#include "lumo_rtcs.h"
#include "lumo_srit.h"
#include "lumo_tps.h"
#include "lumo_trn.h"
#include "regression.h"
#include "rtcs/rtcs_internal.h"
#include "runtime.h"

namespace {

// Scratch arrays handed to the regression for callers of the classic
// interface; the regression never touches them, and they are sized for
// every point so that no size limit follows from them.
constexpr int kRegressionWorkSize = 1024;

bool IsKnownKind(int nType) {
    return nType == TRN_POLY || nType == TRN_TPS || nType == TRN_RTCS || nType == TRN_SRIT;
}

RTCSInfo_t* AsRadar(const TRNInfo_t* psTrn) {
    return static_cast<RTCSInfo_t*>(psTrn->pModel);
}

// A radar fit: the record adopts the option block passed as pExtra (the
// caller does not release it) and stays as it was when the fit fails.
void CalculateRadar(TRNInfo_t* psTrn, int n, double* x1, double* y1, double* z1, double* x2,
                    double* y2, void* pExtra) {
    lumo::rtcs::FitFromImageDescription(AsRadar(psTrn), static_cast<RTCSCOpt_t*>(pExtra), n, x1, y1,
                                        z1, x2, y2);
    psTrn->bCalculated = 1;
}

// Ground coordinates of the container's points through the radar model,
// whose ground side is geographic.
int TransformRadar(const TRNInfo_t* psTrn, double dfX, double dfY, double dfZ, double* pdfOutX,
                   double* pdfOutY) {
    const RTCSInfo_t* psModel = AsRadar(psTrn);
    double dfLon = 0.0, dfLat = 0.0;
    if (psModel->psCOpt == nullptr ||
        !lumo::rtcs::ToGeographic(psModel->psCOpt->sProj, dfX, dfY, &dfLon, &dfLat)) {
        return 0;
    }
    const int nResult = RTCSGeo2Img(psModel, dfLon, dfLat, dfZ, pdfOutX, pdfOutY);
    if (nResult == 0) *pdfOutX = *pdfOutY = 0.0;
    return nResult;
}

SRITInfo_t* AsRigorous(const TRNInfo_t* psTrn) {
    return static_cast<SRITInfo_t*>(psTrn->pModel);
}

struct SegmentDeleter {
    void operator()(EphemerisSeg_t* p) const { LumoSatEphemerisFree(p); }
};

// Fits the rigorous model on a copy of the caller's segment, which the
// record adopts; a fit that fails (fewer than 3 points, or a fatal error
// thrown by the computation) releases the copy and leaves the former model.
void CalculateRigorous(TRNInfo_t* psTrn, int n, double* x1, double* y1, double* z1, double* x2,
                       double* y2, void* pExtra) {
    const auto* psExtra = static_cast<const TRNSritExtra_t*>(pExtra);
    if (psExtra == nullptr || psExtra->psEphemeris == nullptr) {
        lumo::Fatal(lumo::Err::kComputation,
                    _("TRNCalculate3D: a rigorous fit needs its TRNSritExtra_t record.\n"));
    }
    std::unique_ptr<EphemerisSeg_t, SegmentDeleter> psSegment(
        EphemerisSegDuplicate(psExtra->psEphemeris));
    if (SRITCalculate(AsRigorous(psTrn), psExtra->bImageFirst == 1, psSegment.get(), n,
                      &psExtra->sProj, x1, y1, z1, x2, y2) == 1) {
        (void)psSegment.release();  // adopted by the record
        psTrn->bCalculated = 1;
    } else {
        psTrn->bCalculated = 0;
    }
}

void DebugNotImplemented(const char* pszKind, int nLine) {
    if (!lumo::TraceOn()) return;
    lumo::Trace(1, __FILE__, nLine, "<TRNRMSError() not yet implemented for %s>\n", pszKind);
}

GEOInfo_t* AsRegression(const TRNInfo_t* psTrn) {
    return static_cast<GEOInfo_t*>(psTrn->pModel);
}

TPSInfo_t* AsSpline(const TRNInfo_t* psTrn) {
    return static_cast<TPSInfo_t*>(psTrn->pModel);
}

void CalculateRegression(TRNInfo_t* psTrn, int n, double* x1, double* y1, double* x2, double* y2,
                         void* pExtra) {
    const auto size = static_cast<std::size_t>(std::max(n, kRegressionWorkSize));
    std::vector<double> work1(size), work2(size);
    // The regression leaves the record unchanged when it fails (it raises a
    // fatal error), so a former fit stays valid.
    if (GCPRegression(AsRegression(psTrn), x1, y1, x2, y2, n, static_cast<int*>(pExtra),
                      work1.data(), work2.data()) == 0)
        psTrn->bCalculated = 1;
}

void CalculateSpline(TRNInfo_t* psTrn, int n, double* x1, double* y1, double* x2, double* y2) {
    // Fitted into a spline sized for the points and swapped in on success:
    // a failed fit leaves the former spline and flag as they were.
    std::unique_ptr<TPSInfo_t> psFit(new TPSInfo_t(n));
    TPSCalculate(psFit.get(), n, x1, y1, x2, y2);
    delete AsSpline(psTrn);
    psTrn->pModel = psFit.release();
    psTrn->bCalculated = 1;
}

}  // namespace

TRNInfo_t* TRNAllocate(int nType) {
    std::unique_ptr<TRNInfo_t, nova::FreeDeleter> psTrn(
        static_cast<TRNInfo_t*>(HMalloc(sizeof(TRNInfo_t))));
    psTrn->nType = nType;
    psTrn->bCalculated = 0;
    psTrn->pModel = nullptr;
    switch (nType) {
        case TRN_POLY:
            // Zero-filled rather than uninitialised: an unfitted record reads
            // as "never fitted" to the regression.
            psTrn->pModel = HCalloc(1, sizeof(GEOInfo_t));
            break;
        case TRN_TPS:
            psTrn->pModel = new TPSInfo_t(0);
            break;
        case TRN_RTCS:
            psTrn->pModel = RTCSAllocate();
            if (psTrn->pModel == nullptr) throw nova::OutOfMemoryException(sizeof(RTCSInfo_t));
            break;
        case TRN_SRIT:
            // A zeroed record with its own projection and an empty segment;
            // its per-line arrays are sized by each fit from the segment's
            // table, so scenes of any length fit.
            psTrn->pModel = SRITAllocate();
            break;
        default:
            lumo::Warn(lumo::Err::kBadArgument,
                       MkName(_("Illegal nType (%d) passed to TRNAllocate()."), nType));
            break;
    }
    return psTrn.release();
}

void TRNDeallocate(TRNInfo_t* psTrn) {
    if (psTrn == nullptr) return;
    if (psTrn->nType == TRN_POLY)
        std::free(psTrn->pModel);
    else if (psTrn->nType == TRN_TPS)
        delete AsSpline(psTrn);
    else if (psTrn->nType == TRN_SRIT)
        LumoFreeSRITInfo(AsRigorous(psTrn));
    else if (psTrn->nType == TRN_RTCS)
        RTCSFreeModel(AsRadar(psTrn));
    std::free(psTrn);
}

void TRNCalculate(TRNInfo_t* psTrn, int n, double* x1, double* y1, double* x2, double* y2,
                  void* pExtra) {
    std::vector<double> z1(static_cast<std::size_t>(std::max(n, 0)), 0.0);
    std::vector<double> z2(z1.size(), 0.0);
    TRNCalculate3D(psTrn, n, x1, y1, z1.data(), x2, y2, z2.data(), pExtra);
}

void TRNCalculate3D(TRNInfo_t* psTrn, int n, double* x1, double* y1, double* z1, double* x2,
                    double* y2, double* /*z2*/, void* pExtra) {
    if (psTrn == nullptr) return;
    switch (psTrn->nType) {
        case TRN_POLY:
            CalculateRegression(psTrn, n, x1, y1, x2, y2, pExtra);
            break;
        case TRN_TPS:
            CalculateSpline(psTrn, n, x1, y1, x2, y2);
            break;
        case TRN_SRIT:
            CalculateRigorous(psTrn, n, x1, y1, z1, x2, y2, pExtra);
            break;
        case TRN_RTCS:
            CalculateRadar(psTrn, n, x1, y1, z1, x2, y2, pExtra);
            break;
        default:
            psTrn->bCalculated = 0;
            break;
    }
}

int TRNTransform3D(TRNInfo_t* psTrn, double dfX, double dfY, double dfZ, double* pdfOutX,
                   double* pdfOutY, double* pdfOutZ) {
    if (pdfOutZ != nullptr) *pdfOutZ = 0.0;
    if (pdfOutX == nullptr || pdfOutY == nullptr) return 0;
    *pdfOutX = 0.0;
    *pdfOutY = 0.0;
    if (psTrn == nullptr || !psTrn->bCalculated || !IsKnownKind(psTrn->nType)) return 0;
    // A point that is not finite has no image: zeros and failure, rather
    // than a NaN reported as a result.
    if (!std::isfinite(dfX) || !std::isfinite(dfY)) return 0;
    if (psTrn->nType == TRN_POLY)
        return GCPTransform(AsRegression(psTrn), dfX, dfY, pdfOutX, pdfOutY) == 0 ? 1 : 0;
    if (psTrn->nType == TRN_SRIT) {
        SRITGeo2Img(AsRigorous(psTrn), dfX, dfY, dfZ, pdfOutX, pdfOutY);
        return 1;
    }
    if (psTrn->nType == TRN_RTCS) return TransformRadar(psTrn, dfX, dfY, dfZ, pdfOutX, pdfOutY);
    TPSTransform(AsSpline(psTrn), dfX, dfY, pdfOutX, pdfOutY);
    return 1;
}

int TRNTransform(TRNInfo_t* psTrn, double dfX, double dfY, double* pdfOutX, double* pdfOutY) {
    return TRNTransform3D(psTrn, dfX, dfY, 0.0, pdfOutX, pdfOutY, nullptr);
}

void TRNRMSError(TRNInfo_t* psTrn, int n, double* x1, double* y1, double* x2, double* y2,
                 double* pdfRmsX, double* pdfRmsY) {
    if (psTrn == nullptr || pdfRmsX == nullptr || pdfRmsY == nullptr) return;
    if (!IsKnownKind(psTrn->nType)) return;  // an illegal container is a no-op
    *pdfRmsX = 0.0;
    *pdfRmsY = 0.0;
    if (!psTrn->bCalculated) return;
    if (psTrn->nType == TRN_POLY) {
        GCPRootMeanSq(AsRegression(psTrn), x1, y1, x2, y2, n, pdfRmsX, pdfRmsY);
        return;
    }
    if (psTrn->nType == TRN_SRIT) {
        // The rigorous residuals need elevations: TRNRMSError3D gives them.
        DebugNotImplemented("TRN_SRIT", __LINE__);
        return;
    }
    if (psTrn->nType == TRN_RTCS) {
        DebugNotImplemented("TRN_RTCS", __LINE__);
        return;
    }
    double dfMeanX = 0.0;
    double dfMeanY = 0.0;
    TPSRMSError(AsSpline(psTrn), n, x1, y1, x2, y2, &dfMeanX, &dfMeanY, pdfRmsX, pdfRmsY);
}

void TRNRMSError3D(TRNInfo_t* psTrn, int n, double* x1, double* y1, double* z1, double* x2,
                   double* y2, double* pdfRmsX, double* pdfRmsY) {
    if (psTrn != nullptr && psTrn->nType == TRN_SRIT && pdfRmsX != nullptr && pdfRmsY != nullptr) {
        *pdfRmsX = 0.0;
        *pdfRmsY = 0.0;
        if (psTrn->bCalculated) {
            SRITRMSError(AsRigorous(psTrn), n, x1, y1, z1, x2, y2, *pdfRmsX, *pdfRmsY);
        }
        return;
    }
    TRNRMSError(psTrn, n, x1, y1, x2, y2, pdfRmsX, pdfRmsY);
}
