// Rigorous model: record allocation, copy and release, and the exported
// entry points, each of which forwards unchanged to its implementation.
#include <cstdlib>
#include <cstring>
#include <memory>

#include "lumo_ephemeris.h"
#include "lumo_srit.h"
#include "projection.h"
#include "runtime.h"
#include "segment_access.h"
#include "srit/srit_internal.h"

namespace {

// A new copy of a line array of nCount doubles, or null when there is none.
double* CopyLineArray(const double* padfSrc, int nCount) {
    if (padfSrc == nullptr) return nullptr;
    const auto nBytes = static_cast<std::uint64_t>(nCount) * sizeof(double);
    auto* padfCopy = static_cast<double*>(HMalloc(nBytes));
    std::memcpy(padfCopy, padfSrc, nBytes);
    return padfCopy;
}

void CopyProjection(SRITInfo_t* psDst, const SRITInfo_t* psSrc) {
    if (psSrc->psProjInfo == nullptr) {
        std::free(psDst->psProjInfo);
        psDst->psProjInfo = nullptr;
        return;
    }
    if (psDst->psProjInfo == nullptr) {
        psDst->psProjInfo = static_cast<ProjInfo_t*>(HMalloc(sizeof(ProjInfo_t)));
    }
    *psDst->psProjInfo = *psSrc->psProjInfo;
}

}  // namespace

SRITInfo_t* SRITAllocate() {
    // Owned by smart pointers until complete, so a failed allocation leaks
    // nothing.
    std::unique_ptr<SRITInfo_t, nova::FreeDeleter> psModel(
        static_cast<SRITInfo_t*>(HCalloc(1, sizeof(SRITInfo_t))));
    std::unique_ptr<ProjInfo_t, nova::FreeDeleter> psProj(
        static_cast<ProjInfo_t*>(HCalloc(1, sizeof(ProjInfo_t))));
    auto* psSeg = static_cast<EphemerisSeg_t*>(HCalloc(1, sizeof(EphemerisSeg_t)));
    psSeg->nOrbitType = EPH_ORBIT_NONE;
    psSeg->ppOrbitData = nullptr;
    psModel->psEphemeris = psSeg;
    psModel->psProjInfo = psProj.release();
    psModel->padfLineShiftA = nullptr;
    psModel->padfLineShiftB = nullptr;
    return psModel.release();
}

void SRITCopy(SRITInfo_t* psDst, const SRITInfo_t* psSrc) {
    if (psDst == nullptr || psSrc == nullptr || psDst == psSrc) return;

    std::memcpy(psDst->adfCoef, psSrc->adfCoef, sizeof(psDst->adfCoef));
    std::memcpy(psDst->anAux, psSrc->anAux, sizeof(psDst->anAux));
    std::memcpy(psDst->szAuxA, psSrc->szAuxA, sizeof(psDst->szAuxA));
    std::memcpy(psDst->szAuxB, psSrc->szAuxB, sizeof(psDst->szAuxB));
    psDst->bAux = psSrc->bAux;
    std::memcpy(psDst->adfAux, psSrc->adfAux, sizeof(psDst->adfAux));
    std::memcpy(psDst->abyAuxA, psSrc->abyAuxA, sizeof(psDst->abyAuxA));
    std::memcpy(psDst->abyAuxB, psSrc->abyAuxB, sizeof(psDst->abyAuxB));
    std::memcpy(psDst->abyAuxC, psSrc->abyAuxC, sizeof(psDst->abyAuxC));
    std::memcpy(psDst->abyAuxD, psSrc->abyAuxD, sizeof(psDst->abyAuxD));

    std::free(psDst->padfLineShiftB);
    std::free(psDst->padfLineShiftA);
    psDst->padfLineShiftB = nullptr;
    psDst->padfLineShiftA = nullptr;
    // The line arrays are as long as the source segment's attitude table.
    const AttitudeData_t* psTable = lumo::AttitudeRecordOf(psSrc->psEphemeris);
    if (psTable != nullptr && psTable->nNumAttitudeLines >= 1) {
        psDst->padfLineShiftB = CopyLineArray(psSrc->padfLineShiftB, psTable->nNumAttitudeLines);
        psDst->padfLineShiftA = CopyLineArray(psSrc->padfLineShiftA, psTable->nNumAttitudeLines);
    }

    std::memcpy(psDst->Sensor, psSrc->Sensor, sizeof(psDst->Sensor));
    psDst->nSensor = psSrc->nSensor;
    psDst->nModelClass = psSrc->nModelClass;

    EphemerisSegCopyInto(&psDst->psEphemeris, &psSrc->psEphemeris);
    CopyProjection(psDst, psSrc);
}

void LumoFreeSRITInfo(SRITInfo_t* psModel) {
    if (psModel == nullptr) return;
    std::free(psModel->padfLineShiftB);
    std::free(psModel->padfLineShiftA);
    std::free(psModel->psProjInfo);
    LumoSatEphemerisFree(psModel->psEphemeris);
    psModel->psEphemeris = nullptr;
    std::free(psModel);
}

int SRITCalculate(SRITInfo_t* psModel, bool bImageFirst, EphemerisSeg_t* psEphemeris, int nGCP,
                  const ProjInfo_t* psProjInfo, const double* padfA, const double* padfB,
                  const double* padfZ, const double* padfC, const double* padfD) {
    return SRITCalculate_imp(psModel, bImageFirst, psEphemeris, nGCP, psProjInfo, padfA, padfB,
                             padfZ, padfC, padfD);
}

int SRITCalculateN(int nImages, const char* pszImageIds, SRITInfo_t** papsModels, bool bImageFirst,
                   EphemerisSeg_t** papsEphemeris, const ProjInfo_t* psProjInfo, int nGCP,
                   const char* pszGcpImageIds, const char* pszGcpPointIds, const char* pszGcpUsage,
                   const double* padfA, const double* padfB, const double* padfZ,
                   const double* padfSdA, const double* padfSdB, const double* padfSdZ,
                   const double* padfC, const double* padfD, const double* padfSdC,
                   const double* padfSdD, int nTie, const char* pszTieImageIds,
                   const char* pszTiePointIds, const double* padfTiePixel,
                   const double* padfTieLine, double* padfTieZ, const double* padfTieSdPixel,
                   const double* padfTieSdLine, const double* padfTieSdZ, double* padfTieX,
                   double* padfTieY, int* pnReported, char* pszReportedIds, int* panReportedImages,
                   double* padfGivenX, double* padfGivenY, double* padfGivenZ,
                   double* padfEstimatedX, double* padfEstimatedY, double* padfEstimatedZ,
                   double* padfResidualX, double* padfResidualY, double* padfResidualZ) {
    return SRITCalculateMulti(nImages, pszImageIds, papsModels, bImageFirst, papsEphemeris,
                              psProjInfo, nGCP, pszGcpImageIds, pszGcpPointIds, pszGcpUsage, padfA,
                              padfB, padfZ, padfSdA, padfSdB, padfSdZ, padfC, padfD, padfSdC,
                              padfSdD, nTie, pszTieImageIds, pszTiePointIds, padfTiePixel,
                              padfTieLine, padfTieZ, padfTieSdPixel, padfTieSdLine, padfTieSdZ,
                              padfTieX, padfTieY, pnReported, pszReportedIds, panReportedImages,
                              padfGivenX, padfGivenY, padfGivenZ, padfEstimatedX, padfEstimatedY,
                              padfEstimatedZ, padfResidualX, padfResidualY, padfResidualZ);
}

void SRITGeo2Img(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ, double* pdfPixel,
                 double* pdfLine) {
    SRITGeo2Img_imp(psModel, dfX, dfY, dfZ, pdfPixel, pdfLine);
}

int SRITImg2GeoDem(const SRITInfo_t* psModel, double dfPixel, double dfLine, double* pdfZ,
                   double* pdfX, double* pdfY) {
    return SRITImg2GeoDem_imp(psModel, dfPixel, dfLine, pdfZ, pdfX, pdfY);
}

void SRITRMSError(const SRITInfo_t* psModel, int nGCP, const double* padfX, const double* padfY,
                  const double* padfZ, const double* padfPixel, const double* padfLine,
                  double& dfRmsPixel, double& dfRmsLine) {
    SRITRMSError_imp(psModel, nGCP, padfX, padfY, padfZ, padfPixel, padfLine, dfRmsPixel,
                     dfRmsLine);
}

void SPOT1ATo1B(const SRITInfo_t* psModel, double* pdfPixel, double* pdfLine) {
    SPOT1ATo1B_imp(psModel, pdfPixel, pdfLine);
}

void SPOT1BTo1A(const SRITInfo_t* psModel, double* pdfPixel, double* pdfLine) {
    SPOT1BTo1A_imp(psModel, pdfPixel, pdfLine);
}
