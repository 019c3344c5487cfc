// Rigorous model: the exported implementation entry points. The computations,
// the level conversion and the equations live in srit/; here the transforms
// of a computed record add the record checks, the radar-like refinement, the
// level conversion and the null values, and the residuals sum them up.
#include <cmath>
#include <cstddef>

#include "errors.h"
#include "lumo_ephemeris.h"
#include "lumo_srit.h"
#include "null_value.h"
#include "runtime.h"
#include "srit/srit_internal.h"

namespace {

using lumo::srit::GroundTerms;
using lumo::srit::kNull;
using lumo::srit::ModelTerms;

bool Usable(const SRITInfo_t* psModel) {
    return psModel != nullptr && psModel->psEphemeris != nullptr;
}

// Ground position of an image position (pixel, line) at elevation dfZ.
GroundTerms GroundOf(const ModelTerms& m, double dfPixel, double dfLine, double dfZ) {
    return lumo::srit::ImageToGround(m, m.dfCentreColumn - dfPixel, dfLine - m.dfCentreLine, dfZ);
}

}  // namespace

// ---------------------------------------------------------------------------
// Level conversion and computation
// ---------------------------------------------------------------------------

void SPOT1ATo1B_imp(const SRITInfo_t* psModel, double* pdfPixel, double* pdfLine) {
    if (psModel != nullptr) lumo::srit::ConvertTo1B(psModel->psEphemeris, pdfPixel, pdfLine);
}

void SPOT1BTo1A_imp(const SRITInfo_t* psModel, double* pdfPixel, double* pdfLine) {
    if (psModel != nullptr) lumo::srit::ConvertTo1A(psModel->psEphemeris, pdfPixel, pdfLine);
}

void SPOT1BTo1AControlPoint_imp(const EphemerisSeg_t* const* papsEphemeris, int nImage,
                                double* pdfPixel, double* pdfLine) {
    if (papsEphemeris == nullptr || nImage < 0) return;
    lumo::srit::ConvertControlPointTo1A(papsEphemeris[nImage], pdfPixel, pdfLine);
}

int SRITCalculate_imp(SRITInfo_t* psModel, bool bImageFirst, EphemerisSeg_t* psEphemeris, int nGCP,
                      const ProjInfo_t* psProjInfo, const double* padfA, const double* padfB,
                      const double* padfZ, const double* padfC, const double* padfD) {
    return lumo::srit::CalculateOne(psModel, bImageFirst, psEphemeris, nGCP, psProjInfo, padfA,
                                    padfB, padfZ, padfC, padfD);
}

// ---------------------------------------------------------------------------
// Ground and image transforms
// ---------------------------------------------------------------------------

void toutin_imp(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ, double* pdfPixel,
                double* pdfLine) {
    if (!Usable(psModel)) {
        lumo::SetNullPair(pdfPixel, pdfLine);
        return;
    }
    lumo::srit::GroundToImage(lumo::srit::TermsOfRecord(*psModel), dfX, dfY, dfZ, pdfPixel,
                              pdfLine);
}

void toutin_1_imp(const SRITInfo_t* psModel, double dfXc, double dfYc, double dfZ, double* pdfX,
                  double* pdfY) {
    if (!Usable(psModel)) {
        lumo::SetNullPair(pdfX, pdfY);
        return;
    }
    const GroundTerms s =
        lumo::srit::ImageToGround(lumo::srit::TermsOfRecord(*psModel), dfXc, dfYc, dfZ);
    *pdfX = s.dfX;
    *pdfY = s.dfY;
}

void SRITGeo2Img_imp(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ,
                     double* pdfPixel, double* pdfLine) {
    if (!Usable(psModel)) {
        lumo::SetNullPair(pdfPixel, pdfLine);
        return;
    }
    const ModelTerms m = lumo::srit::TermsOfRecord(*psModel);
    double dfPixel = 0.0, dfLine = 0.0;
    lumo::srit::GroundToImage(m, dfX, dfY, dfZ, &dfPixel, &dfLine);
    if (m.sSelect.bRadarLike) {
        // Refine with the inverse until the ground closes to 10 ground
        // units, at most four rounds.
        for (int nRound = 0;; ++nRound) {
            const GroundTerms s = GroundOf(m, dfPixel, dfLine, dfZ);
            const double dX = s.dfX - dfX, dY = s.dfY - dfY;
            const bool bClosed = std::abs(dX) < 10.0 && std::abs(dY) < 10.0;
            if (nRound == 4) {
                // The fourth round's answer is checked the same way: one that
                // does not close is no image position.
                if (!bClosed) {
                    lumo::SetNullPair(pdfPixel, pdfLine);
                    return;
                }
                break;
            }
            if (bClosed) {
                *pdfPixel = dfPixel;
                *pdfLine = dfLine;
                return;
            }
            lumo::srit::GroundToImage(m, dfX - dX, dfY - dY, dfZ, &dfPixel, &dfLine);
        }
    }
    if (lumo::srit::IsLevelSensor(psModel->nSensor)) SPOT1ATo1B_imp(psModel, &dfPixel, &dfLine);
    if (!std::isfinite(dfPixel) || !std::isfinite(dfLine)) {
        lumo::SetNullPair(pdfPixel, pdfLine);  // a record SRITValidate refuses
        return;
    }
    *pdfPixel = dfPixel;
    *pdfLine = dfLine;
}

int SRITImg2Geo_imp(const SRITInfo_t* psModel, double dfPixel, double dfLine, double dfZ,
                    double* pdfX, double* pdfY) {
    if (dfZ == kNull || !Usable(psModel)) {
        lumo::SetNullPair(pdfX, pdfY);
        return 0;
    }
    if (lumo::srit::IsLevelSensor(psModel->nSensor) && psModel->psEphemeris->nLevelConvForm > 0) {
        SPOT1BTo1A_imp(psModel, &dfPixel, &dfLine);
    }
    const GroundTerms s = GroundOf(lumo::srit::TermsOfRecord(*psModel), dfPixel, dfLine, dfZ);
    // A record SRITValidate refuses (a zero radius, say) gives no numbers:
    // no ground point rather than NaN reported as one.
    if (!std::isfinite(s.dfX) || !std::isfinite(s.dfY)) {
        lumo::SetNullPair(pdfX, pdfY);
        return 0;
    }
    *pdfX = s.dfX;
    *pdfY = s.dfY;
    return 1;
}

int SRITImg2GeoDem_imp(const SRITInfo_t* psModel, double dfPixel, double dfLine, double* pdfZ,
                       double* pdfX, double* pdfY) {
    lumo::SetNullPair(pdfX, pdfY);
    if (pdfZ == nullptr) return 0;
    if (*pdfZ == kNull) *pdfZ = 0.0;
    // The answer's status is the transform's: a point it could not map is no
    // success.
    return SRITImg2Geo_imp(psModel, dfPixel, dfLine, *pdfZ, pdfX, pdfY);
}

int SRITGeo2ImgExact(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ,
                     double* pdfPixel, double* pdfLine) {
    lumo::SetNullPair(pdfPixel, pdfLine);
    if (!Usable(psModel) || !std::isfinite(dfX) || !std::isfinite(dfY) || !std::isfinite(dfZ) ||
        dfZ == kNull) {
        return 0;
    }
    double p = 0.0, l = 0.0;
    if (!lumo::srit::GroundToImageExact(lumo::srit::TermsOfRecord(*psModel), dfX, dfY, dfZ, &p,
                                        &l)) {
        return 0;
    }
    if (lumo::srit::IsLevelSensor(psModel->nSensor)) SPOT1ATo1B_imp(psModel, &p, &l);
    *pdfPixel = p;
    *pdfLine = l;
    return 1;
}

// ---------------------------------------------------------------------------
// Residuals
// ---------------------------------------------------------------------------

void SRITRMSError_imp(const SRITInfo_t* psModel, int nGCP, const double* padfX, const double* padfY,
                      const double* padfZ, const double* padfPixel, const double* padfLine,
                      double& dfRmsPixel, double& dfRmsLine) {
    dfRmsPixel = 0.0;
    dfRmsLine = 0.0;
    if (nGCP < 2) return;
    if (psModel == nullptr || padfX == nullptr || padfY == nullptr || padfZ == nullptr ||
        padfPixel == nullptr || padfLine == nullptr) {
        lumo::Fatal(lumo::Err::kComputation, _("SRITRMSError: a null model or point array.\n"));
    }
    double dfSumPixel = 0.0, dfSumLine = 0.0;
    for (int i = 0; i < nGCP; ++i) {
        double dfPixel = 0.0, dfLine = 0.0;
        SRITGeo2Img_imp(psModel, padfX[i], padfY[i], padfZ[i], &dfPixel, &dfLine);
        dfSumPixel += (dfPixel - padfPixel[i]) * (dfPixel - padfPixel[i]);
        dfSumLine += (dfLine - padfLine[i]) * (dfLine - padfLine[i]);
    }
    dfRmsPixel = std::sqrt(dfSumPixel / nGCP);
    dfRmsLine = std::sqrt(dfSumLine / nGCP);
}
