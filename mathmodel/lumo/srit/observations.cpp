// Observation rows of the rigorous adjustment: two rows per control-point
// measurement, the rows that bind the images of a block (pairs, directions
// across the elevation displacement, points without elevation), and the
// parameter constraints.
#include <algorithm>
#include <cmath>

#include "srit/srit_internal.h"

namespace lumo {
namespace srit {
namespace {

// Planimetric standard deviation: mean of X and Y, 2.5 when either is not given.
double PlanimetricSd(const PointRecord& sPoint) {
    if (sPoint.dfSdX == kNull || sPoint.dfSdY == kNull) return 2.5;
    return 0.5 * (sPoint.dfSdX + sPoint.dfSdY);
}

// The X and Y rows of one measurement of a full control point.
void AddControlRows(Adjustment& sAdj, NormalEquations& sNormal, const PointRecord& sPoint) {
    double adfCoef[kMaxUnknowns];
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        const PointSlot& sSlot = sPoint.asSlots[k];
        if (sSlot.nFlag != 1) continue;
        const ImageState& sImg = sAdj.asImages[k];
        const double dfSigma = sImg.sSetup.dfAccuracy;
        const double dfTan =
            2.5 * std::tan(sImg.psSeg->dfViewAngle - sSlot.dfXc * sImg.sTerms.dfIfov);
        const double w = 1.0 / std::sqrt(dfSigma * dfSigma + 6.25 + dfTan * dfTan);
        if (sAdj.dfMinControlWeight == 0.0 || w < sAdj.dfMinControlWeight) {
            sAdj.dfMinControlWeight = w;
        }
        const GroundTerms s = ImageToGround(sImg.sTerms, sSlot.dfXc, sSlot.dfYc, sPoint.dfZ);
        sNormal.ClearRow();
        ObservationCoefficients(sImg.sTerms, s, true, adfCoef);
        WriteBlock(sAdj, k, adfCoef, sNormal.Row());
        sNormal.AddRow(s.dfX - sPoint.dfX, w);
        sNormal.ClearRow();
        ObservationCoefficients(sImg.sTerms, s, false, adfCoef);
        WriteBlock(sAdj, k, adfCoef, sNormal.Row());
        sNormal.AddRow(s.dfY - sPoint.dfY, w);
        sAdj.dfLastRowWeight = w;
    }
}

// One measurement's ground position and its X and Y coefficient rows.
struct MeasurementRows {
    GroundTerms s;
    double adfX[kMaxUnknowns];
    double adfY[kMaxUnknowns];
};

MeasurementRows RowsOf(const ImageState& sImg, const PointSlot& sSlot, double dfZ) {
    MeasurementRows sRows{};
    sRows.s = ImageToGround(sImg.sTerms, sSlot.dfXc, sSlot.dfYc, dfZ);
    ObservationCoefficients(sImg.sTerms, sRows.s, true, sRows.adfX);
    ObservationCoefficients(sImg.sTerms, sRows.s, false, sRows.adfY);
    return sRows;
}

// Adds the row whose image-i part is pdfI and image-j part pdfJ.
void AddPairRow(Adjustment& sAdj, NormalEquations& sNormal, const ImagePair& sPair,
                const double* pdfI, const double* pdfJ, double dfMisclosure, double dfWeight) {
    sNormal.ClearRow();
    WriteBlock(sAdj, sPair.i, pdfI, sNormal.Row());
    WriteBlock(sAdj, sPair.j, pdfJ, sNormal.Row());
    sNormal.AddRow(dfMisclosure, dfWeight);
    sAdj.dfLastRowWeight = dfWeight;
}

// A point's measurements in both images of a listed pair, with their ground
// positions and coefficient rows at one elevation.
struct PairMeasurements {
    const ImagePair& sPair;
    const PointSlot& sI;
    const PointSlot& sJ;
    const ImageState& sImgI;
    const ImageState& sImgJ;
    MeasurementRows sRi;
    MeasurementRows sRj;
};

// Calls fn for every listed pair in which both of the point's measurements
// take part in the adjustment.
template <typename F>
void ForEachUsedPair(const Adjustment& sAdj, const PointRecord& sPoint, double dfZ, F fn) {
    for (const ImagePair& sPair : sAdj.asPairs) {
        const PointSlot& sI = sPoint.asSlots[sPair.i];
        const PointSlot& sJ = sPoint.asSlots[sPair.j];
        if (sI.nFlag != 1 || sJ.nFlag != 1) continue;
        const ImageState& sImgI = sAdj.asImages[sPair.i];
        const ImageState& sImgJ = sAdj.asImages[sPair.j];
        fn(PairMeasurements{sPair, sI, sJ, sImgI, sImgJ, RowsOf(sImgI, sI, dfZ),
                            RowsOf(sImgJ, sJ, dfZ)});
    }
}

// Rows that make the ground positions of a point with a known elevation agree
// in both images of a pair.
void AddPairRows(Adjustment& sAdj, NormalEquations& sNormal, const PointRecord& sPoint) {
    const double dfSdZ = sPoint.dfSdZ == kNull ? 2.5 : sPoint.dfSdZ;
    const bool bRows =
        sPoint.cType == 'A' || (sPoint.cType == 'X' && dfSdZ <= 0.5 * PlanimetricSd(sPoint));
    if (!bRows) return;
    ForEachUsedPair(sAdj, sPoint, sPoint.dfZ, [&](const PairMeasurements& m) {
        const double dfSigI = m.sImgI.sSetup.dfAccuracy, dfSigJ = m.sImgJ.sSetup.dfAccuracy;
        const double dfTanDiff =
            std::tan(m.sImgI.psSeg->dfViewAngle - m.sI.dfXc * m.sImgI.sTerms.dfIfov) -
            std::tan(m.sImgJ.psSeg->dfViewAngle - m.sJ.dfXc * m.sImgJ.sTerms.dfIfov);
        const double w =
            1.0 / std::sqrt(6.25 + (dfSigI * dfSigI + dfSigJ * dfSigJ) / (dfTanDiff * dfTanDiff));
        if (!(w > 0.0) || !std::isfinite(w)) return;  // parallel rays bind nothing
        double adfNegX[kMaxUnknowns], adfNegY[kMaxUnknowns];
        for (int p = 0; p < kMaxUnknowns; ++p) {
            adfNegX[p] = -m.sRj.adfX[p];
            adfNegY[p] = -m.sRj.adfY[p];
        }
        AddPairRow(sAdj, sNormal, m.sPair, m.sRi.adfX, adfNegX, m.sRi.s.dfX - m.sRj.s.dfX, w);
        AddPairRow(sAdj, sNormal, m.sPair, m.sRi.adfY, adfNegY, m.sRi.s.dfY - m.sRj.s.dfY, w);
    });
}

// Rows across the direction in which the two images' ground positions part
// with a wrong elevation: they hold whatever the elevation.
void AddCrossRows(Adjustment& sAdj, NormalEquations& sNormal, const PointRecord& sPoint) {
    const double dfZ = IsTieOrNoElevation(sPoint) ? sPoint.dfEstZ : sPoint.dfZ;
    ForEachUsedPair(sAdj, sPoint, dfZ, [&](const PairMeasurements& m) {
        const Displacement ai = DisplacementOf(m.sImgI.sTerms, m.sI.dfXc);
        const Displacement aj = DisplacementOf(m.sImgJ.sTerms, m.sJ.dfXc);
        const double dx = ai.ax - aj.ax, dy = ai.ay - aj.ay;
        const double n = std::max(std::sqrt(dx * dx + dy * dy), 1e-06);
        double adfI[kMaxUnknowns], adfJ[kMaxUnknowns];
        for (int p = 0; p < kMaxUnknowns; ++p) {
            adfI[p] = (dy * m.sRi.adfX[p] - dx * m.sRi.adfY[p]) / n;
            adfJ[p] = (dx * m.sRj.adfY[p] - dy * m.sRj.adfX[p]) / n;
        }
        const double dfMisclosure =
            (dy * (m.sRi.s.dfX - m.sRj.s.dfX) - dx * (m.sRi.s.dfY - m.sRj.s.dfY)) / n;
        const double w = sPoint.cType == 'H' || sAdj.dfLastRowWeight == 0.0
                             ? sAdj.dfMinControlWeight
                             : sAdj.dfLastRowWeight;
        AddPairRow(sAdj, sNormal, m.sPair, adfI, adfJ, dfMisclosure, w);
    });
}

// Rows of a control point without elevation: across the direction in which
// its image position moves with the elevation.
void AddNoElevationRows(Adjustment& sAdj, NormalEquations& sNormal, const PointRecord& sPoint) {
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        const PointSlot& sSlot = sPoint.asSlots[k];
        if (sSlot.nFlag != 1) continue;
        const ImageState& sImg = sAdj.asImages[k];
        const MeasurementRows sR = RowsOf(sImg, sSlot, sPoint.dfEstZ);
        const Displacement a = DisplacementOf(sImg.sTerms, sSlot.dfXc);
        const double n = std::sqrt(a.ax * a.ax + a.ay * a.ay);
        if (!(n > 0.0)) continue;
        double adfCoef[kMaxUnknowns];
        for (int p = 0; p < kMaxUnknowns; ++p) {
            adfCoef[p] = (a.ay * sR.adfX[p] - a.ax * sR.adfY[p]) / n;
        }
        const double dfMisclosure =
            (a.ay * (sR.s.dfX - sPoint.dfX) - a.ax * (sR.s.dfY - sPoint.dfY)) / n;
        const double dfPlan = PlanimetricSd(sPoint);
        const double dfSigma = sImg.sSetup.dfAccuracy;
        const double w = 1.0 / std::sqrt(dfPlan * dfPlan + dfSigma * dfSigma);
        sNormal.ClearRow();
        WriteBlock(sAdj, k, adfCoef, sNormal.Row());
        sNormal.AddRow(dfMisclosure, w);
        sAdj.dfLastRowWeight = w;
    }
}

}  // namespace

// Observation rows of every point in use: control rows, then the rows that
// bind the images of a block together.
void AddObservationRows(Adjustment& sAdj, NormalEquations& sNormal) {
    for (const PointRecord& sPoint : sAdj.asPoints) {
        if (sPoint.nInUse != 1) continue;
        if (sPoint.cType == 'X') AddControlRows(sAdj, sNormal, sPoint);
        if (sAdj.asPairs.empty() && sPoint.cType != 'P') continue;
        AddPairRows(sAdj, sNormal, sPoint);
        AddCrossRows(sAdj, sNormal, sPoint);
        if (sPoint.cType == 'P') AddNoElevationRows(sAdj, sNormal, sPoint);
    }
}

// Pseudo-observations that hold P3 ... P7 near their starting values.
void AddConstraintRows(const Adjustment& sAdj, NormalEquations& sNormal) {
    const ConstraintWeights& W = sAdj.sWeights;
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        const ImageState& sImg = sAdj.asImages[k];
        const bool bConstrain = sImg.bConstrained || ShortNameContains(sImg.sSetup, "TM") ||
                                ShortNameContains(sImg.sSetup, "ETM");
        if (!bConstrain) continue;
        const double* P = sImg.sTerms.P;
        const double* P0 = sImg.adfStart;
        const int nStart = BlockStart(sAdj, k);
        const double adfMisclosure[5] = {1.0 - P0[kAcrossScale] / P[kAcrossScale],
                                         P[kAcrossTilt] - P0[kAcrossTilt], P[kShear] - P0[kShear],
                                         1.0 - P0[kLineSpacing] / P[kLineSpacing],
                                         P[kAlongTilt] - P0[kAlongTilt]};
        const double adfWeight[5] = {W.W3, W.W4, W.W5, W.W6, W.W7};
        for (int i = 0; i < 5; ++i) {
            sNormal.ClearRow();
            sNormal.Row()[nStart + 3 + i] = 1.0;
            sNormal.AddRow(adfMisclosure[i], adfWeight[i]);
        }
    }
}

}  // namespace srit
}  // namespace lumo
