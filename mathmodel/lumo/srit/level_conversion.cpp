// Level 1A/1B conversion of SPOT-family image coordinates with the
// polynomial the ephemeris segment carries: raw (1A) to resampled (1B)
// geometry and back, and the control-point form used before an adjustment.
#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstddef>

#include "errors.h"
#include "runtime.h"
#include "segment_access.h"
#include "srit/srit_internal.h"

namespace lumo {
namespace srit {
namespace {

constexpr int kFormCubic = 20;  // cubic polynomials in pixel and line
constexpr int kFormRatio = 39;  // normalised polynomials with a ratio in pixel

struct ImagePoint {
    double dfPixel;
    double dfLine;
};

// k[0] + k[1] v + k[2] v^2 + k[3] v^3.
double Cubic(double v, const double* k) {
    return k[0] + v * (k[1] + v * (k[2] + v * k[3]));
}

// k[0] + k[1] v + ... + k[nDegree] v^nDegree.
double Polynomial(double v, const double* k, int nDegree) {
    double dfSum = k[nDegree];
    for (int i = nDegree - 1; i >= 0; --i) dfSum = dfSum * v + k[i];
    return dfSum;
}

// Per-line look table of a "SPOT5" segment, or null: an attitude record with
// at least one line.
const AttitudeData_t* Spot5LineTable(const EphemerisSeg_t& sSeg) {
    return SensorNameStartsWith(sSeg, "SPOT5") ? AttitudeLinesOf(&sSeg) : nullptr;
}

// Entry of the table for an input line counted from 0: lines before the
// image take the first entry, lines at or beyond its end the last. The last
// usable entry is bounded by the table's own length as well as by the image's
// line count, so a segment whose counts disagree is never read beyond its
// table.
const AttitudeLine_t& LineEntry(const EphemerisSeg_t& sSeg, const AttitudeData_t& sTable,
                                double dfLine) {
    int nUsable = sTable.nNumAttitudeLines;
    if (sSeg.nNumLines >= 1) nUsable = std::min(nUsable, sSeg.nNumLines);
    int nIndex = 0;  // also for a NaN line
    if (dfLine >= static_cast<double>(nUsable)) {
        nIndex = nUsable - 1;
    } else if (dfLine > 0.0) {
        nIndex = static_cast<int>(dfLine);  // truncation
    }
    return sTable.pAttitudeLines[nIndex];
}

// A coefficient that divides the coordinates must be a non-zero number.
void RequireDivisor(const EphemerisSeg_t& sSeg, int nIndex) {
    const double dfValue = sSeg.adfLevelConvCoefs[nIndex];
    if (dfValue != 0.0 && std::isfinite(dfValue)) return;
    lumo::Fatal(
        lumo::Err::kComputation,
        MkName(_("Level 1A/1B conversion (form %d): coefficient %d of the segment is %.17g, "
                 "but it divides the image coordinates.\n"),
               static_cast<int>(sSeg.nLevelConvForm), nIndex, dfValue));
}

ImagePoint Level1ATo1B(const EphemerisSeg_t& sSeg, ImagePoint sIn) {
    const double* K = sSeg.adfLevelConvCoefs;
    if (sSeg.nLevelConvForm == kFormCubic) {
        const double dfLine = Cubic(sIn.dfLine, K);
        return {Cubic(dfLine, K + 16) + Cubic(sIn.dfPixel, K + 4), dfLine};
    }
    RequireDivisor(sSeg, 5);
    RequireDivisor(sSeg, 7);
    const int32_t* Q = sSeg.anLevelConvParams;
    double dfL = sIn.dfLine + (Q[1] - 1.0);
    double dfP = sIn.dfPixel + (Q[0] - 1.0);
    if (const AttitudeData_t* psTable = Spot5LineTable(sSeg)) {
        const AttitudeLine_t& sEntry = LineEntry(sSeg, *psTable, sIn.dfLine);
        dfL += sEntry.dfValue2;
        dfP += sEntry.dfValue1;
    }
    const double dfNormLine = (dfL - K[4]) / K[5];
    const double dfNormPixel = (dfP - K[6]) / K[7];
    const double dfM = Polynomial(dfNormLine, K + 8, 5);
    const double dfLine = K[0] + K[1] * dfM - Q[3] + 1.0;
    const double dfPixel = (Polynomial(dfM, K + 23, 5) + Cubic(dfNormPixel, K + 14)) /
                               Polynomial(dfM, K + 18, 4) * K[3] +
                           K[2] - Q[2] + 1.0;
    return {dfPixel, dfLine};
}

ImagePoint Level1BTo1A(const EphemerisSeg_t& sSeg, ImagePoint sIn, bool bLineTable) {
    const double* K = sSeg.adfLevelConvCoefs;
    if (sSeg.nLevelConvForm == kFormCubic) {
        const double dfOffset = sIn.dfPixel - Cubic(sIn.dfLine, K + 16);
        return {Cubic(dfOffset, K + 12), Cubic(sIn.dfLine, K + 8)};
    }
    RequireDivisor(sSeg, 1);
    RequireDivisor(sSeg, 3);
    const int32_t* Q = sSeg.anLevelConvParams;
    const double dfNormLine = (Q[3] - 1.0 + sIn.dfLine - K[0]) / K[1];
    const double dfNormPixel = (Q[2] - 1.0 + sIn.dfPixel - K[2]) / K[3];
    const double dfE =
        Polynomial(dfNormLine, K + 18, 4) * dfNormPixel - Polynomial(dfNormLine, K + 23, 5);
    ImagePoint sOut{Cubic(dfE, K + 35) * K[7] + K[6] - Q[0] + 1.0,
                    Polynomial(dfNormLine, K + 29, 5) * K[5] + K[4] - Q[1] + 1.0};
    if (bLineTable) {
        if (const AttitudeData_t* psTable = Spot5LineTable(sSeg)) {
            const AttitudeLine_t& sEntry = LineEntry(sSeg, *psTable, sIn.dfLine);
            sOut.dfLine -= sEntry.dfValue2;
            sOut.dfPixel -= sEntry.dfValue1;
        }
    }
    return sOut;
}

enum class Direction { To1B, To1A, To1AControlPoint };

// Converts (pixel, line) in place with the segment's polynomial. Forms other
// than 20 and 39 leave the coordinates unchanged; a finite point that does
// not convert to a finite one is a fatal error and changes nothing.
void ConvertInPlace(const EphemerisSeg_t* psSeg, Direction eDirection, double* pdfPixel,
                    double* pdfLine) {
    if (psSeg == nullptr || pdfPixel == nullptr || pdfLine == nullptr) return;
    if (psSeg->nLevelConvForm != kFormCubic && psSeg->nLevelConvForm != kFormRatio) return;
    const ImagePoint sIn{*pdfPixel, *pdfLine};
    ImagePoint sOut{};
    switch (eDirection) {
        case Direction::To1B:
            sOut = Level1ATo1B(*psSeg, sIn);
            break;
        case Direction::To1A:
            sOut = Level1BTo1A(*psSeg, sIn, true);
            break;
        case Direction::To1AControlPoint:
            sOut = Level1BTo1A(*psSeg, sIn, false);
            break;
    }
    const bool bFiniteIn = std::isfinite(sIn.dfPixel) && std::isfinite(sIn.dfLine);
    if (bFiniteIn && !(std::isfinite(sOut.dfPixel) && std::isfinite(sOut.dfLine))) {
        lumo::Fatal(lumo::Err::kComputation,
                    MkName(_("Level 1A/1B conversion (form %d) of pixel %.17g, line %.17g gives no "
                             "finite result: check the segment's conversion coefficients.\n"),
                           static_cast<int>(psSeg->nLevelConvForm), sIn.dfPixel, sIn.dfLine));
    }
    *pdfPixel = sOut.dfPixel;
    *pdfLine = sOut.dfLine;
}

}  // namespace

void ConvertTo1B(const EphemerisSeg_t* psSeg, double* pdfPixel, double* pdfLine) {
    ConvertInPlace(psSeg, Direction::To1B, pdfPixel, pdfLine);
}

void ConvertTo1A(const EphemerisSeg_t* psSeg, double* pdfPixel, double* pdfLine) {
    ConvertInPlace(psSeg, Direction::To1A, pdfPixel, pdfLine);
}

void ConvertControlPointTo1A(const EphemerisSeg_t* psSeg, double* pdfPixel, double* pdfLine) {
    ConvertInPlace(psSeg, Direction::To1AControlPoint, pdfPixel, pdfLine);
}

}  // namespace srit
}  // namespace lumo
