// The rational function model's image-space adjustment fitted to control
// points: the bias compensation of a delivered model. The adjustment maps
// the rational functions' own pixel and line (p, l) to
//   pixel = p + a0 + a1 p + a2 l + a3 p l + a4 p^2 + a5 l^2
// and likewise for the line, so its terms are the regression of the control
// points' misses (measured minus p, l) on (p, l): the host's regression has
// exactly that term order.
#include <cmath>
#include <string>
#include <vector>

#include "errors.h"
#include "lumo_rf.h"
#include "regression.h"
#include "runtime.h"

namespace {

[[noreturn]] void FailPoint(int i, const char* pszWhat) {
    lumo::Fatal(lumo::Err::kBadArgument,
                MkName(_("RFComputeAdjustment: control point %d %s.\n"), i + 1, pszWhat));
}

}  // namespace

int RFComputeAdjustment(RFInfo_t* psRF, int nKind, int nGCP, const double* padfX,
                        const double* padfY, const double* padfZ, const double* padfPixel,
                        const double* padfLine) {
    if (psRF == nullptr || padfX == nullptr || padfY == nullptr || padfZ == nullptr ||
        padfPixel == nullptr || padfLine == nullptr) {
        lumo::Fatal(lumo::Err::kBadArgument, _("RFComputeAdjustment: a null record or array.\n"));
    }
    if (nKind != RF_ADJUST_SHIFT && nKind != RF_ADJUST_AFFINE && nKind != RF_ADJUST_SECOND) {
        lumo::FatalReal(lumo::Err::kBadArgument, "RFComputeAdjustment kind", nKind, 0);
    }
    if (nGCP < 0) lumo::FatalReal(lumo::Err::kBadArgument, "RFComputeAdjustment nGCP", nGCP, 0);
    if (nGCP < nKind) return 0;
    // The rational functions alone: no adjustment, and no half-pixel shift,
    // which the adjustment's constant takes over.
    RFInfo_t sRaw = *psRF;
    sRaw.nAdjust = 0;
    sRaw.nHalfPixelShift = 0;
    const auto n = static_cast<std::size_t>(nGCP);
    std::vector<double> p(n), l(n), dp(n), dl(n);
    double dfSumP = 0.0, dfSumL = 0.0;
    for (std::size_t i = 0; i < n; ++i) {
        const int k = static_cast<int>(i);
        if (!std::isfinite(padfX[i]) || !std::isfinite(padfY[i]) || !std::isfinite(padfZ[i]) ||
            !std::isfinite(padfPixel[i]) || !std::isfinite(padfLine[i])) {
            FailPoint(k, "has a coordinate that is not a number");
        }
        RFGeo2Img(&sRaw, padfX[i], padfY[i], padfZ[i], &p[i], &l[i]);
        if (!std::isfinite(p[i]) || !std::isfinite(l[i]) || p[i] == LUMO_NULL_VALUE) {
            FailPoint(k, "cannot be mapped by the rational functions");
        }
        dp[i] = padfPixel[i] - p[i];
        dl[i] = padfLine[i] - l[i];
        dfSumP += dp[i];
        dfSumL += dl[i];
    }
    double adfPixel[RF_ADJUST_TERMS] = {}, adfLine[RF_ADJUST_TERMS] = {};
    if (nKind == RF_ADJUST_SHIFT) {
        adfPixel[0] = dfSumP / nGCP;
        adfLine[0] = dfSumL / nGCP;
    } else {
        GEOInfo_t sFit{};
        int nOrder = nKind == RF_ADJUST_AFFINE ? 1 : 2;
        const int nWanted = nOrder;
        GCPRegression2(&sFit, "PIXEL", p.data(), l.data(), "PIXEL", dp.data(), dl.data(), nGCP,
                       &nOrder, 0, nullptr, nullptr);
        // Points on one line (or too few for the order) do not determine the
        // terms: no adjustment rather than a lowered one.
        if (sFit.nFitKind != GCP_FIT_POLYNOMIAL || nOrder != nWanted) return 0;
        for (int k = 0; k < nKind; ++k) {
            adfPixel[k] = sFit.adfXCoeffs[k];
            adfLine[k] = sFit.adfYCoeffs[k];
        }
    }
    for (int k = 0; k < RF_ADJUST_TERMS; ++k) {
        if (!std::isfinite(adfPixel[k]) || !std::isfinite(adfLine[k])) return 0;
    }
    for (int k = 0; k < RF_ADJUST_TERMS; ++k) {
        psRF->adfPixelAdjust[k] = adfPixel[k];
        psRF->adfLineAdjust[k] = adfLine[k];
    }
    psRF->nAdjust = 1;
    return 1;
}
