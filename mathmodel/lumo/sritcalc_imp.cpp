// Rigorous model implementation: the SPOT level 1A/1B conversions, the
// one-image adjustment (sensor table, starting values, observation equations,
// packed normal equations), the ground and image transforms and the
// residuals, and the block adjustment of several images with tie points,
// which runs the same driver with more images, points and image pairs.
#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstddef>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <string>
#include <unordered_map>
#include <vector>

#include "errors.h"
#include "lumo_ephemeris.h"
#include "lumo_sensor.h"
#include "lumo_srit.h"
#include "projection.h"
#include "runtime.h"

namespace {

constexpr int kFormCubic = 20;  // cubic polynomials in pixel and line
constexpr int kFormRatio = 39;  // normalised polynomials with a ratio in pixel

// ---------------------------------------------------------------------------
// Level 1A/1B conversion
// ---------------------------------------------------------------------------

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

// Case-insensitive prefix test on a fixed-size sensor name that may lack a
// terminator.
bool SensorStartsWith(const EphemerisSeg_t& sSeg, const char* pszPrefix) {
    for (std::size_t i = 0; pszPrefix[i] != '\0'; ++i) {
        if (i >= sizeof(sSeg.szSensorName)) return false;
        const auto c = static_cast<unsigned char>(sSeg.szSensorName[i]);
        if (std::toupper(c) != std::toupper(static_cast<unsigned char>(pszPrefix[i]))) {
            return false;
        }
    }
    return true;
}

// Per-line look table of a "SPOT5" segment, or null: an attitude record with
// at least one line.
const AttitudeData_t* Spot5LineTable(const EphemerisSeg_t& sSeg) {
    if (!SensorStartsWith(sSeg, "SPOT5") || sSeg.nOrbitType != EPH_ORBIT_ATTITUDE ||
        sSeg.ppOrbitData == nullptr) {
        return nullptr;
    }
    const auto* psTable = static_cast<const AttitudeData_t*>(*sSeg.ppOrbitData);
    if (psTable == nullptr || psTable->pAttitudeLines == nullptr ||
        psTable->nNumAttitudeLines < 1) {
        return nullptr;
    }
    return psTable;
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

const EphemerisSeg_t* SegmentOf(const SRITInfo_t* psModel) {
    return psModel != nullptr ? psModel->psEphemeris : nullptr;
}

}  // namespace

void SPOT1ATo1B_imp(const SRITInfo_t* psModel, double* pdfPixel, double* pdfLine) {
    ConvertInPlace(SegmentOf(psModel), Direction::To1B, pdfPixel, pdfLine);
}

void SPOT1BTo1A_imp(const SRITInfo_t* psModel, double* pdfPixel, double* pdfLine) {
    ConvertInPlace(SegmentOf(psModel), Direction::To1A, pdfPixel, pdfLine);
}

void SPOT1BTo1AControlPoint_imp(const EphemerisSeg_t* const* papsEphemeris, int nImage,
                                double* pdfPixel, double* pdfLine) {
    if (papsEphemeris == nullptr || nImage < 0) return;
    ConvertInPlace(papsEphemeris[nImage], Direction::To1AControlPoint, pdfPixel, pdfLine);
}

// ---------------------------------------------------------------------------
// Adjustment working records. Everything belongs to one call: images, points
// and the normal equations live in containers of the call's Adjustment, so a
// fatal error (which throws) releases them and computations may run side by
// side. The records are per image and per point so that the block adjustment
// of several images runs the same steps with more images and pairs.
// ---------------------------------------------------------------------------

namespace {

constexpr int kMaxUnknowns = 13;  // P0 ... P12 per image
constexpr int kIterations = 7;
constexpr double kEarthRate = 7.292115841e-5;  // rad/s
constexpr double kNull = LUMO_NULL_VALUE;

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

// A row of the sensor table. A prefix with sub-rows is a group: once the
// prefix matches, one of its sub-rows must match as well. pszSub "" is the
// group's catch-all row.
struct SensorRow {
    const char* pszPrefix;
    const char* pszAltPrefix;  // alternative prefix, or null
    const char* pszSub;        // null: the prefix alone decides
    int nFewUnknowns;          // unknowns below the threshold count
    int nManyUnknowns;         // unknowns from the threshold count on
    int nThreshold;            // 0: always nFewUnknowns
    double dfAccuracy;         // metres; kResByThree: the pixel size / 3
    const char* pszShortName;  // null: the whole sensor name
    int nCode;
};

constexpr double kResByThree = -1.0;

// clang-format off
const SensorRow kSensorTable[] = {
    {"PLA", nullptr, nullptr, 8, 8, 0, 3.0, "PLA", 0},
    {"MLA", nullptr, nullptr, 8, 8, 0, 6.0, "MLA", 1},
    {"IRIS", nullptr, nullptr, 13, 13, 0, 10.0, "IRIS", 184},
    {"SAR", nullptr, nullptr, 9, 13, 7, 30.0, "SAR", 9},
    {"TM", nullptr, nullptr, 8, 11, 6, 10.0, "TM", 30},
    {"ETM", nullptr, nullptr, 8, 11, 6, 7.0, "ETM", 31},
    {"IKONOS", nullptr, nullptr, 8, 11, 6, kResByThree, "IKONOS", 32},
    {"MESSR", nullptr, nullptr, 8, 8, 0, 25.0, "MESSR", 184},
    // 16 unknowns in the catalogue; an image block holds the model's 13.
    {"MEIS", nullptr, nullptr, 16, 16, 0, 2.0, "MEIS", 184},
    {"LISS-1", nullptr, nullptr, 8, 8, 0, 25.0, "LISS-1", 10},
    {"LISS-2", nullptr, nullptr, 8, 8, 0, 10.0, "LISS-2", 11},
    {"LISS-3", nullptr, nullptr, 8, 8, 0, 10.0, "LISS-3", 12},
    {"LISS-L3", nullptr, "LISS-L3-L2", 11, 11, 0, 10.0, "LISS-L3-L2", 14},
    {"LISS-L3", nullptr, "", 8, 8, 0, 10.0, "LISS-L3", 13},
    {"LISS-P3", nullptr, "LISS-P3-L2", 11, 11, 0, 3.0, "LISS-P3-L2", 18},
    {"LISS-P3", nullptr, "", 8, 8, 0, 3.0, "LISS-P3", 17},
    {"LISS-W3", nullptr, nullptr, 8, 8, 0, 100.0, "LISS-W3", 19},
    {"LISS-M3", nullptr, nullptr, 8, 8, 0, 6.0, "LISS-M3", 23},
    {"LISS-L4", nullptr, "LISS-L4-L2", 11, 11, 0, kResByThree, "LISS-L4-L2", 16},
    {"LISS-L4", nullptr, "", 8, 8, 0, kResByThree, "LISS-L4", 15},
    {"LISS-AWF", nullptr, "LISS-AWF-L2", 11, 11, 0, kResByThree, "LISS-AWF-L2", 22},
    {"LISS-AWF", nullptr, "", 8, 8, 0, kResByThree, "LISS-AWF", 21},
    {"EOC", nullptr, nullptr, 8, 8, 0, kResByThree, "EOC", 24},
    {"ASTER", nullptr, nullptr, 8, 8, 0, kResByThree, "ASTER", 8},
    {"QBIRD", nullptr, "QBIRD_PAN", 8, 12, 6, 0.6, "QBIRD_PAN", 44},
    {"QBIRD", nullptr, "", 8, 12, 6, 2.0, "QBIRD_MULTI", 47},
    {"SPOT5", nullptr, "SPOT5_PAN_2", 8, 12, 6, 1.0, "SPOT5_PAN_2_5", 54},
    {"SPOT5", nullptr, "SPOT5_PAN_5", 8, 12, 6, 2.0, "SPOT5_PAN_5", 55},
    {"SPOT5", nullptr, "SPOT5_MULTI", 8, 12, 6, 3.0, "SPOT5_MULTI", 57},
    {"MODIS", nullptr, "MODIS_250", 8, 11, 6, kResByThree, "MODIS_250", 63},
    {"MODIS", nullptr, "MODIS_500", 8, 11, 6, kResByThree, "MODIS_500", 64},
    {"MODIS", nullptr, "", 8, 11, 6, kResByThree, "MODIS_1000", 65},
    {"CBERS", nullptr, "CBERS_HRC_L2", 8, 8, 0, kResByThree, "CBERS_HRC_L2", 67},
    {"CBERS", nullptr, "CBERS_HRC", 8, 12, 6, kResByThree, "CBERS_HRC", 66},
    {"CBERS", nullptr, "CBERS_CCD_L2", 8, 8, 0, kResByThree, "CBERS_CCD_L2", 69},
    {"CBERS", nullptr, "CBERS_CCD", 8, 8, 0, kResByThree, "CBERS_CCD", 68},
    {"CBERS", nullptr, "CBERS_IRM_80_L2", 8, 8, 0, kResByThree, "CBERS_IRM_80_L2", 71},
    {"CBERS", nullptr, "CBERS_IRM_80", 8, 8, 0, kResByThree, "CBERS_IRM_80", 70},
    {"CBERS", nullptr, "CBERS_IRM_160_L2", 8, 8, 0, kResByThree, "CBERS_IRM_160_L2", 73},
    {"CBERS", nullptr, "CBERS_IRM_160", 8, 8, 0, kResByThree, "CBERS_IRM_160", 72},
    {"CBERS", nullptr, "CBERS_WFI_L2", 8, 8, 0, kResByThree, "CBERS_WFI_L2", 75},
    {"CBERS", nullptr, "CBERS_WFI", 8, 8, 0, kResByThree, "CBERS_WFI", 74},
    {"FORMOSAT", nullptr, "FORMOSAT_PAN_L2", 12, 12, 0, kResByThree, "FORMOSAT_PAN_L2", 52},
    {"FORMOSAT", nullptr, "FORMOSAT_PAN", 12, 12, 0, kResByThree, "FORMOSAT_PAN", 50},
    {"FORMOSAT", nullptr, "FORMOSAT_MULTIL2", 12, 12, 0, kResByThree, "FORMOSAT_MULTIL2", 53},
    {"FORMOSAT", nullptr, "FORMOSAT_MULTI", 12, 12, 0, kResByThree, "FORMOSAT_MULTI", 51},
    {"ALOS", nullptr, "ALOS_PRISM_L1", 8, 12, 6, kResByThree, nullptr, 78},
    {"ALOS", nullptr, "ALOS_PRISM_L2", 8, 8, 0, kResByThree, nullptr, 79},
    {"ALOS", nullptr, "ALOS_AVNIR_L1", 8, 8, 0, kResByThree, nullptr, 80},
    {"ALOS", nullptr, "ALOS_AVNIR_L2", 8, 8, 0, kResByThree, nullptr, 81},
    {"WVIEW1_PAN", "WVIEW_PAN", nullptr, 8, 12, 6, 0.5, "WVIEW_PAN", 93},
    {"WVIEW_MULTI", nullptr, nullptr, 8, 12, 6, 2.0, "WVIEW_MULTI", 95},
    {"KOMPSAT", nullptr, "KOMPSAT2_PAN", 8, 12, 6, 0.5, nullptr, 84},
    {"KOMPSAT", nullptr, "KOMPSAT2_MULTI", 8, 8, 0, kResByThree, nullptr, 85},
    {"NEW", nullptr, nullptr, 8, 8, 0, kResByThree, "NEW", 184},
};
// clang-format on

constexpr std::size_t kHeavyWeightRows = 4;  // PLA, MLA, IRIS, SAR weigh 0.05555

// Case-insensitive prefix test on a name of at most nSize characters.
bool NameStartsWith(const char* pszName, std::size_t nSize, const char* pszPrefix) {
    for (std::size_t i = 0; pszPrefix[i] != '\0'; ++i) {
        if (i >= nSize || pszName[i] == '\0') return false;
        if (std::toupper(static_cast<unsigned char>(pszName[i])) !=
            std::toupper(static_cast<unsigned char>(pszPrefix[i]))) {
            return false;
        }
    }
    return true;
}

bool SegmentStartsWith(const EphemerisSeg_t& sSeg, const char* pszPrefix) {
    return NameStartsWith(sSeg.szSensorName, sizeof(sSeg.szSensorName), pszPrefix);
}

// The sensor name as a terminated text even when all its bytes are used.
std::string SensorNameOf(const EphemerisSeg_t& sSeg) {
    std::size_t n = 0;
    while (n < sizeof(sSeg.szSensorName) && sSeg.szSensorName[n] != '\0') ++n;
    return std::string(sSeg.szSensorName, n);
}

[[noreturn]] void ReportUnsupportedSensor(const EphemerisSeg_t& sSeg) {
    lumo::PrintUserMessage(stdout, "Unsupported satellite sensor\n");
    lumo::FatalChar(lumo::Err::kSensor, "Satellite Sensor", SensorNameOf(sSeg).c_str());
}

// Fills the set-up of an image from the sensor table. A name that matches no
// row, or a group prefix none of whose sub-rows matches, is an unsupported
// sensor.
ImageSetup SetupFromSensorTable(const EphemerisSeg_t& sSeg, int nObservations) {
    const std::size_t nRows = sizeof(kSensorTable) / sizeof(kSensorTable[0]);
    for (std::size_t i = 0; i < nRows; ++i) {
        const SensorRow& sRow = kSensorTable[i];
        const bool bPrefix =
            SegmentStartsWith(sSeg, sRow.pszPrefix) ||
            (sRow.pszAltPrefix != nullptr && SegmentStartsWith(sSeg, sRow.pszAltPrefix));
        if (!bPrefix) continue;
        // Walk the group's sub-rows (a plain row is its own group of one).
        for (std::size_t j = i;
             j < nRows && std::strcmp(kSensorTable[j].pszPrefix, sRow.pszPrefix) == 0; ++j) {
            const SensorRow& sSub = kSensorTable[j];
            if (sSub.pszSub != nullptr && !SegmentStartsWith(sSeg, sSub.pszSub)) continue;
            ImageSetup sSetup;
            sSetup.nUnknowns = (sSub.nThreshold > 0 && nObservations >= sSub.nThreshold)
                                   ? sSub.nManyUnknowns
                                   : sSub.nFewUnknowns;
            // The model has 13 parameters per image: a catalogue row asking
            // for more adjusts all 13.
            sSetup.nUnknowns = std::min(sSetup.nUnknowns, kMaxUnknowns);
            sSetup.dfWeightFactor = i < kHeavyWeightRows ? 0.05555 : 0.05555556;
            sSetup.dfAccuracy =
                sSub.dfAccuracy == kResByThree ? sSeg.dfPixelRes / 3.0 : sSub.dfAccuracy;
            if (std::strcmp(sSub.pszPrefix, "TM") == 0 && sSeg.dfPixelRes == 15.0) {
                sSetup.dfAccuracy = 7.0;
            }
            sSetup.nSensor = sSub.nCode;
            if (std::strcmp(sSub.pszPrefix, "SAR") == 0 && sSeg.dfPixelRes == 6.25) {
                sSetup.nSensor = 26;
            }
            const std::string osShort =
                sSub.pszShortName != nullptr ? sSub.pszShortName : SensorNameOf(sSeg);
            std::memcpy(sSetup.szShortName, osShort.data(),
                        std::min<std::size_t>(osShort.size(), SRIT_SENSOR_SIZE));
            return sSetup;
        }
        ReportUnsupportedSensor(sSeg);
    }
    ReportUnsupportedSensor(sSeg);
}

// Per-line look table of a segment (kind 1 with lines), or null.
const AttitudeData_t* AttitudeTable(const EphemerisSeg_t* psSeg) {
    if (psSeg == nullptr || psSeg->nOrbitType != EPH_ORBIT_ATTITUDE ||
        psSeg->ppOrbitData == nullptr) {
        return nullptr;
    }
    const auto* psTable = static_cast<const AttitudeData_t*>(*psSeg->ppOrbitData);
    if (psTable == nullptr || psTable->pAttitudeLines == nullptr ||
        psTable->nNumAttitudeLines < 1) {
        return nullptr;
    }
    return psTable;
}

// Kind-1 sub-record (lines or not), for the attitude values.
const AttitudeData_t* AttitudeRecord(const EphemerisSeg_t& sSeg) {
    if (sSeg.nOrbitType != EPH_ORBIT_ATTITUDE || sSeg.ppOrbitData == nullptr) return nullptr;
    return static_cast<const AttitudeData_t*>(*sSeg.ppOrbitData);
}

bool ShortNameContains(const ImageSetup& sSetup, const char* pszText) {
    return std::strstr(sSetup.szShortName, pszText) != nullptr;
}

// One image of the adjustment: its segment, set-up, parameters and the
// derived and fixed values of the model.
struct ImageState {
    const EphemerisSeg_t* psSeg = nullptr;
    ImageSetup sSetup;
    bool bRadar = false;
    bool bLinearGroup = false;  // PLA, MLA, TM, ETM, IKONOS, L2
    bool bFlat = false;         // no Earth-curvature term
    bool bFormosatPan = false;
    bool bConstrained = false;
    int nObservations = 0;      // control-point observations, used and check
    int nUsedObservations = 0;  // those that enter the adjustment
    int nBlockStart = 0;        // first position of the image's block in the unknown vector
    double P[kMaxUnknowns] = {};
    double adfStart[kMaxUnknowns] = {};              // starting values (P3 ... P7 used)
    double c0 = 0.0, c2 = 0.0, c4 = 0.0, c10 = 0.0;  // 2N, IFOV, centre column and line
    double c6 = 0.0, c9 = 0.0, c15 = 0.0;
    double dfGeocLat = 0.0;  // geocentric latitude of the scene centre
    double adfAttitude[3] = {};
    // Per-line values of PLA/MLA images: the table's dfValue1 and dfValue2.
    std::vector<double> adfLineA;
    std::vector<double> adfLineB;
    bool bHasLineArrays = false;

    const int* Positions() const { return bRadar ? kRadarPosition : kOpticalPosition; }
    void UpdateDerived() {
        c6 = std::cos(std::atan(P[7]));
        c15 = P[4] / c6;
        c9 = (P[4] * P[4] + 1.0) / (P[3] * c6) + 2.0 * (c15 * c15 + 1.0) / c0;
    }
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
    explicit NormalEquations(int nUnknowns)
        : m_nSize(nUnknowns + 1),
          m_adf(static_cast<std::size_t>(m_nSize) * (m_nSize + 1) / 2, 0.0),
          m_adfRow(static_cast<std::size_t>(m_nSize), 0.0),
          m_adfScale(static_cast<std::size_t>(m_nSize), 0.0) {}

    int Unknowns() const { return m_nSize - 1; }
    void Clear() { std::fill(m_adf.begin(), m_adf.end(), 0.0); }
    double* Row() { return m_adfRow.data(); }  // coefficients, set by the caller
    void ClearRow() { std::fill(m_adfRow.begin(), m_adfRow.end(), 0.0); }

    // Adds the row set in Row() with misclosure l (computed - observed) and
    // weight w (1 / standard deviation): element (r, c) gains g_r g_c.
    // Only the non-zero elements are visited: a row of a block adjustment
    // touches one or two image blocks of a long unknown vector.
    void AddRow(double dfMisclosure, double dfWeight) {
        const int n = m_nSize - 1;
        m_anNonZero.clear();
        for (int r = 0; r < n; ++r) {
            if (m_adfRow[r] == 0.0) continue;
            m_adfRow[r] *= dfWeight;
            m_anNonZero.push_back(r);
        }
        m_adfRow[n] = dfMisclosure * dfWeight;
        m_anNonZero.push_back(n);
        for (std::size_t a = 0; a < m_anNonZero.size(); ++a) {
            const int r = m_anNonZero[a];
            const double g = m_adfRow[r];
            if (g == 0.0) continue;
            double* pdf = &m_adf[Offset(r)];
            for (std::size_t b = a; b < m_anNonZero.size(); ++b) {
                const int c = m_anNonZero[b];
                pdf[c - r] += g * m_adfRow[c];
            }
        }
    }

    // In-place Cholesky factorisation of the augmented matrix and back
    // substitution; x solves (sum w^2 a a^T) x = -(sum w^2 a l). False, with
    // x left zero, when a pivot is not positive: also one that rounding left
    // a tiny positive remnant of a singular system (below 1e-12 of its
    // diagonal element), which would otherwise give huge meaningless
    // corrections.
    bool Solve(double* pdfX) {
        const int n = m_nSize - 1;
        std::fill(pdfX, pdfX + n, 0.0);
        for (int r = 0; r < n; ++r) m_adfScale[r] = m_adf[Offset(r)];
        for (int r = 0; r < n; ++r) {
            double* pdfRow = &m_adf[Offset(r)];
            const double dfPivot = pdfRow[0];
            if (!(dfPivot > 1e-12 * m_adfScale[r])) return false;
            const double dfRoot = std::sqrt(dfPivot);
            for (int c = r; c <= n; ++c) pdfRow[c - r] /= dfRoot;
            for (int i = r + 1; i <= n; ++i) {
                const double dfRi = pdfRow[i - r];
                if (dfRi == 0.0) continue;
                double* pdfI = &m_adf[Offset(i)];
                for (int j = i; j <= n; ++j) pdfI[j - i] -= dfRi * pdfRow[j - r];
            }
        }
        for (int r = n - 1; r >= 0; --r) {
            const double* pdfRow = &m_adf[Offset(r)];
            double dfSum = -pdfRow[n - r];
            for (int j = r + 1; j < n; ++j) dfSum -= pdfRow[j - r] * pdfX[j];
            pdfX[r] = dfSum / pdfRow[0];
        }
        return true;
    }

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

// The terms of the image-to-ground equations of one measurement.
struct GroundTerms {
    double t = 0.0, u = 0.0, H = 0.0, g = 0.0, K = 0.0;
    double dfX = 0.0, dfY = 0.0;
};

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

// Image-to-ground of the adjustment at centred coordinates and elevation.
GroundTerms AdjustmentImageToGround(const ImageState& sImg, double xc, double yc, double Z) {
    const double* P = sImg.P;
    if (sImg.bFormosatPan) {
        // Lens distortion of the FORMOSAT panchromatic camera.
        const double p = sImg.c4 - xc;
        const double d = p - 6000.0;
        const double r = std::sqrt(d * d + 748225.0);
        const double q = r * 0.0014496 - 6.9536888e-11 * r * r * r;
        xc = sImg.c4 - (p + d / r * q);
        yc += 865.0 / r * q;
    }
    GroundTerms s;
    const double c2 = sImg.c2;
    s.t = -yc * P[6];
    s.u = -(c2 * xc * P[3]) / (c2 * P[4] * xc + 1.0);
    s.H = sImg.bFlat ? Z : Z - s.u * s.u / sImg.c0;
    s.g = (P[4] * c2 * xc + 1.0) /
          (std::sqrt((c2 * xc) * (c2 * xc) + 1.0) * std::sqrt(P[4] * P[4] + 1.0));
    s.K = s.H * s.H / (2.0 * P[3]) + s.H;
    const double dfCommon = (P[5] - s.t * P[8] - s.u * P[9]) * s.t +
                            (1.0 - 2.0 * Z / sImg.c0) * s.u -
                            ((P[4] * P[4] + 1.0) / P[3] * s.u + sImg.c15) * s.H;
    double A = 0.0, B = 0.0;
    if (sImg.bLinearGroup) {
        double s1 = 0.0, s2 = 0.0;
        const int l = static_cast<int>(yc + sImg.c10);
        if (sImg.bHasLineArrays && l >= 1 && l <= static_cast<int>(sImg.adfLineA.size())) {
            s1 = sImg.adfLineB[l - 1];
            s2 = sImg.adfLineA[l - 1];
        }
        A = dfCommon + s1;
        B = (1.0 - s.u * P[10]) * s.t + s.H * P[7] + s2;
    } else {
        A = s.g * P[12] * s.K + dfCommon;
        B = (1.0 - s.u * P[10]) * s.t + s.H * P[7] + P[11] * s.t * s.t;
    }
    const double ct = std::cos(P[2]), st = std::sin(P[2]);
    s.dfX = P[0] + A * ct + B * st;
    s.dfY = P[1] - A * st + B * ct;
    return s;
}

// Coefficients of the X row (bXRow) or the Y row, by parameter P0 ... P12.
void ObservationCoefficients(const ImageState& sImg, const GroundTerms& s, bool bXRow,
                             double* pdfCoef) {
    const double* P = sImg.P;
    const double ct = std::cos(P[2]), st = std::sin(P[2]);
    const double t = s.t, u = s.u, H = s.H;
    const double dfP4Term = u * u / P[3] - H / sImg.c6;
    if (bXRow) {
        const double c[kMaxUnknowns] = {
            1.0,           0.0,         s.dfY - P[1],         u * ct,
            dfP4Term * ct, t * ct,      (ct * P[5] + st) * t, H * st,
            -t * t * ct,   -t * u * ct, -t * u * st,          t * t * st,
            s.g * s.K * ct};
        std::copy(c, c + kMaxUnknowns, pdfCoef);
    } else {
        const double c[kMaxUnknowns] = {0.0,
                                        1.0,
                                        -(s.dfX - P[0]),
                                        -u * st,
                                        -dfP4Term * st,
                                        -t * st,
                                        (ct - st * P[5]) * t,
                                        H * ct,
                                        t * t * st,
                                        t * u * st,
                                        -t * u * ct,
                                        t * t * ct,
                                        -s.g * s.K * st};
        std::copy(c, c + kMaxUnknowns, pdfCoef);
    }
}

// Start of image k's block in the unknown vector.
int BlockStart(const Adjustment& sAdj, std::size_t k) {
    return sAdj.asImages[k].nBlockStart;
}

// Writes image k's coefficients (by parameter) into its block of the row;
// positions beyond the image's unknown count are not written.
void WriteBlock(const Adjustment& sAdj, std::size_t k, const double* pdfCoef, double* pdfRow) {
    const ImageState& sImg = sAdj.asImages[k];
    const int* anPos = sImg.Positions();
    const int nStart = BlockStart(sAdj, k);
    for (int p = 0; p < kMaxUnknowns; ++p) {
        if (anPos[p] < sImg.sSetup.nUnknowns) pdfRow[nStart + anPos[p]] = pdfCoef[p];
    }
}

// Moving a ground point's elevation by dZ moves the ground position derived
// from its measurement at centred pixel xc by (ax, ay) * dZ.
struct Displacement {
    double ax = 0.0, ay = 0.0;
};

Displacement DisplacementOf(const ImageState& sImg, double xc) {
    const double* P = sImg.P;
    const double c2 = sImg.c2;
    const double u = -(c2 * xc * P[3]) / (c2 * P[4] * xc + 1.0);
    double D = u * sImg.c9 + sImg.c15;
    if (!sImg.bLinearGroup) {
        const double g = (P[4] * c2 * xc + 1.0) /
                         (std::sqrt((c2 * xc) * (c2 * xc) + 1.0) * std::sqrt(P[4] * P[4] + 1.0));
        D -= g * P[12];
    }
    const double ct = std::cos(P[2]), st = std::sin(P[2]);
    return {P[7] * st - D * ct, D * st + P[7] * ct};
}

// Number of images in which the point takes part in the adjustment.
int UsedSlots(const PointRecord& sPoint) {
    int n = 0;
    for (const PointSlot& sSlot : sPoint.asSlots) n += sSlot.nFlag == 1 ? 1 : 0;
    return n;
}

// Planimetric standard deviation: mean of X and Y, 2.5 when either is not given.
double PlanimetricSd(const PointRecord& sPoint) {
    if (sPoint.dfSdX == kNull || sPoint.dfSdY == kNull) return 2.5;
    return 0.5 * (sPoint.dfSdX + sPoint.dfSdY);
}

// Ground position of a point's measurements met from several images.
struct Intersection {
    double dfX = 0.0, dfY = 0.0, dfZ = 0.0;
    double dfMeanAbsX = 0.0, dfMeanAbsY = 0.0;  // mean |estimate - image-derived position|
};

// Intersects the rays of the point's used measurements near elevation Z0:
// every image gives its ground position at Z0 and the direction in which it
// moves with the elevation; the least-squares meeting point gives X, Y and the
// elevation change. When the directions are parallel (no intersection), the
// mean ground position at Z0 is taken.
Intersection Intersect(const Adjustment& sAdj, const PointRecord& sPoint, double dfZ0) {
    NormalEquations sNormal(3);
    std::vector<double> adfX, adfY;
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        const PointSlot& sSlot = sPoint.asSlots[k];
        if (sSlot.nFlag != 1) continue;
        const ImageState& sImg = sAdj.asImages[k];
        const GroundTerms s = AdjustmentImageToGround(sImg, sSlot.dfXc, sSlot.dfYc, dfZ0);
        const Displacement a = DisplacementOf(sImg, sSlot.dfXc);
        adfX.push_back(s.dfX);
        adfY.push_back(s.dfY);
        double* pdfRow = sNormal.Row();
        pdfRow[0] = 1.0;
        pdfRow[1] = 0.0;
        pdfRow[2] = -a.ax;
        sNormal.AddRow(-s.dfX, 1.0);
        pdfRow[0] = 0.0;
        pdfRow[1] = 1.0;
        pdfRow[2] = -a.ay;
        sNormal.AddRow(-s.dfY, 1.0);
    }
    Intersection sOut;
    if (adfX.empty()) return sOut;
    double adfSolution[3] = {0.0, 0.0, 0.0};
    if (adfX.size() >= 2 && sNormal.Solve(adfSolution) && std::isfinite(adfSolution[2])) {
        sOut.dfX = adfSolution[0];
        sOut.dfY = adfSolution[1];
        sOut.dfZ = dfZ0 + adfSolution[2];
    } else {
        for (std::size_t i = 0; i < adfX.size(); ++i) {
            sOut.dfX += adfX[i] / static_cast<double>(adfX.size());
            sOut.dfY += adfY[i] / static_cast<double>(adfY.size());
        }
        sOut.dfZ = dfZ0;
    }
    for (std::size_t i = 0; i < adfX.size(); ++i) {
        sOut.dfMeanAbsX += std::abs(sOut.dfX - adfX[i]) / static_cast<double>(adfX.size());
        sOut.dfMeanAbsY += std::abs(sOut.dfY - adfY[i]) / static_cast<double>(adfY.size());
    }
    return sOut;
}

bool IsTieOrNoElevation(const PointRecord& sPoint) {
    return sPoint.cType == 'H' || sPoint.cType == 'P';
}

// Elevations of the points without one: first the mean elevation of the
// points that have one, then (and after every iteration) the intersection of
// their measurements in two or more images.
void EstimateElevations(Adjustment& sAdj, bool bFirst) {
    if (bFirst) {
        double dfSum = 0.0;
        int nCount = 0;
        for (const PointRecord& sPoint : sAdj.asPoints) {
            if (sPoint.nInUse != 1 || (sPoint.cType != 'X' && sPoint.cType != 'A')) continue;
            dfSum += sPoint.dfZ;
            ++nCount;
        }
        const double dfMean = nCount > 0 ? dfSum / nCount : 0.0;
        for (PointRecord& sPoint : sAdj.asPoints) {
            if (sPoint.nInUse == 1 && IsTieOrNoElevation(sPoint)) sPoint.dfEstZ = dfMean;
        }
    }
    for (PointRecord& sPoint : sAdj.asPoints) {
        if (sPoint.nInUse != 1 || !IsTieOrNoElevation(sPoint) || UsedSlots(sPoint) < 2) continue;
        const Intersection sMeet = Intersect(sAdj, sPoint, sPoint.dfEstZ);
        sPoint.dfEstX = sMeet.dfX;
        sPoint.dfEstY = sMeet.dfY;
        sPoint.dfEstZ = sMeet.dfZ;
    }
}

// Ground estimate and residuals (given minus estimated) of every point from
// its used measurements.
void EstimatePoints(Adjustment& sAdj) {
    for (PointRecord& sPoint : sAdj.asPoints) {
        if (sPoint.nInUse != 1) continue;
        const int nUsed = UsedSlots(sPoint);
        if (nUsed == 0) continue;
        const bool bKnownZ = sPoint.cType == 'X' || sPoint.cType == 'A';
        const double dfZ0 = bKnownZ ? sPoint.dfZ : sPoint.dfEstZ;
        if (nUsed == 1) {
            // One ray: its ground position at the point's (estimated) elevation.
            std::size_t k = 0;
            while (sPoint.asSlots[k].nFlag != 1) ++k;
            const PointSlot& sSlot = sPoint.asSlots[k];
            const GroundTerms s =
                AdjustmentImageToGround(sAdj.asImages[k], sSlot.dfXc, sSlot.dfYc, dfZ0);
            sPoint.dfEstX = s.dfX;
            sPoint.dfEstY = s.dfY;
            sPoint.dfEstZ = sPoint.cType == 'X' ? 0.0 : dfZ0;
            const bool bControl = sPoint.cType == 'X' || sPoint.cType == 'P';
            sPoint.dfResX = bControl ? sPoint.dfX - s.dfX : 0.0;
            sPoint.dfResY = bControl ? sPoint.dfY - s.dfY : 0.0;
            sPoint.dfResZ = 0.0;
            continue;
        }
        const Intersection sMeet = Intersect(sAdj, sPoint, dfZ0);
        sPoint.dfEstX = sMeet.dfX;
        sPoint.dfEstY = sMeet.dfY;
        sPoint.dfEstZ = sMeet.dfZ;
        const bool bControl = sPoint.cType == 'X' || sPoint.cType == 'P';
        sPoint.dfResX = bControl ? sPoint.dfX - sMeet.dfX : sMeet.dfMeanAbsX;
        sPoint.dfResY = bControl ? sPoint.dfY - sMeet.dfY : sMeet.dfMeanAbsY;
        sPoint.dfResZ = bKnownZ ? sPoint.dfZ - sMeet.dfZ : 0.0;
    }
}

// The X and Y rows of one measurement of a full control point.
void AddControlRows(Adjustment& sAdj, NormalEquations& sNormal, const PointRecord& sPoint) {
    double adfCoef[kMaxUnknowns];
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        const PointSlot& sSlot = sPoint.asSlots[k];
        if (sSlot.nFlag != 1) continue;
        const ImageState& sImg = sAdj.asImages[k];
        const double dfSigma = sImg.sSetup.dfAccuracy;
        const double dfTan = 2.5 * std::tan(sImg.psSeg->dfViewAngle - sSlot.dfXc * sImg.c2);
        const double w = 1.0 / std::sqrt(dfSigma * dfSigma + 6.25 + dfTan * dfTan);
        if (sAdj.dfMinControlWeight == 0.0 || w < sAdj.dfMinControlWeight) {
            sAdj.dfMinControlWeight = w;
        }
        const GroundTerms s = AdjustmentImageToGround(sImg, sSlot.dfXc, sSlot.dfYc, sPoint.dfZ);
        sNormal.ClearRow();
        ObservationCoefficients(sImg, s, true, adfCoef);
        WriteBlock(sAdj, k, adfCoef, sNormal.Row());
        sNormal.AddRow(s.dfX - sPoint.dfX, w);
        sNormal.ClearRow();
        ObservationCoefficients(sImg, s, false, adfCoef);
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
    sRows.s = AdjustmentImageToGround(sImg, sSlot.dfXc, sSlot.dfYc, dfZ);
    ObservationCoefficients(sImg, sRows.s, true, sRows.adfX);
    ObservationCoefficients(sImg, sRows.s, false, sRows.adfY);
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

// Rows that make the ground positions of a point with a known elevation agree
// in both images of a pair.
void AddPairRows(Adjustment& sAdj, NormalEquations& sNormal, const PointRecord& sPoint) {
    const double dfSdZ = sPoint.dfSdZ == kNull ? 2.5 : sPoint.dfSdZ;
    const bool bRows =
        sPoint.cType == 'A' || (sPoint.cType == 'X' && dfSdZ <= 0.5 * PlanimetricSd(sPoint));
    if (!bRows) return;
    for (const ImagePair& sPair : sAdj.asPairs) {
        const PointSlot& sI = sPoint.asSlots[sPair.i];
        const PointSlot& sJ = sPoint.asSlots[sPair.j];
        if (sI.nFlag != 1 || sJ.nFlag != 1) continue;
        const ImageState& sImgI = sAdj.asImages[sPair.i];
        const ImageState& sImgJ = sAdj.asImages[sPair.j];
        const MeasurementRows sRi = RowsOf(sImgI, sI, sPoint.dfZ);
        const MeasurementRows sRj = RowsOf(sImgJ, sJ, sPoint.dfZ);
        const double dfSigI = sImgI.sSetup.dfAccuracy, dfSigJ = sImgJ.sSetup.dfAccuracy;
        const double dfTanDiff = std::tan(sImgI.psSeg->dfViewAngle - sI.dfXc * sImgI.c2) -
                                 std::tan(sImgJ.psSeg->dfViewAngle - sJ.dfXc * sImgJ.c2);
        const double w =
            1.0 / std::sqrt(6.25 + (dfSigI * dfSigI + dfSigJ * dfSigJ) / (dfTanDiff * dfTanDiff));
        if (!(w > 0.0) || !std::isfinite(w)) continue;  // parallel rays bind nothing
        double adfNegX[kMaxUnknowns], adfNegY[kMaxUnknowns];
        for (int p = 0; p < kMaxUnknowns; ++p) {
            adfNegX[p] = -sRj.adfX[p];
            adfNegY[p] = -sRj.adfY[p];
        }
        AddPairRow(sAdj, sNormal, sPair, sRi.adfX, adfNegX, sRi.s.dfX - sRj.s.dfX, w);
        AddPairRow(sAdj, sNormal, sPair, sRi.adfY, adfNegY, sRi.s.dfY - sRj.s.dfY, w);
    }
}

// Rows across the direction in which the two images' ground positions part
// with a wrong elevation: they hold whatever the elevation.
void AddCrossRows(Adjustment& sAdj, NormalEquations& sNormal, const PointRecord& sPoint) {
    const double dfZ = IsTieOrNoElevation(sPoint) ? sPoint.dfEstZ : sPoint.dfZ;
    for (const ImagePair& sPair : sAdj.asPairs) {
        const PointSlot& sI = sPoint.asSlots[sPair.i];
        const PointSlot& sJ = sPoint.asSlots[sPair.j];
        if (sI.nFlag != 1 || sJ.nFlag != 1) continue;
        const ImageState& sImgI = sAdj.asImages[sPair.i];
        const ImageState& sImgJ = sAdj.asImages[sPair.j];
        const MeasurementRows sRi = RowsOf(sImgI, sI, dfZ);
        const MeasurementRows sRj = RowsOf(sImgJ, sJ, dfZ);
        const Displacement ai = DisplacementOf(sImgI, sI.dfXc);
        const Displacement aj = DisplacementOf(sImgJ, sJ.dfXc);
        const double dx = ai.ax - aj.ax, dy = ai.ay - aj.ay;
        const double n = std::max(std::sqrt(dx * dx + dy * dy), 1e-06);
        double adfI[kMaxUnknowns], adfJ[kMaxUnknowns];
        for (int p = 0; p < kMaxUnknowns; ++p) {
            adfI[p] = (dy * sRi.adfX[p] - dx * sRi.adfY[p]) / n;
            adfJ[p] = (dx * sRj.adfY[p] - dy * sRj.adfX[p]) / n;
        }
        const double dfMisclosure =
            (dy * (sRi.s.dfX - sRj.s.dfX) - dx * (sRi.s.dfY - sRj.s.dfY)) / n;
        const double w = sPoint.cType == 'H' || sAdj.dfLastRowWeight == 0.0
                             ? sAdj.dfMinControlWeight
                             : sAdj.dfLastRowWeight;
        AddPairRow(sAdj, sNormal, sPair, adfI, adfJ, dfMisclosure, w);
    }
}

// Rows of a control point without elevation: across the direction in which
// its image position moves with the elevation.
void AddNoElevationRows(Adjustment& sAdj, NormalEquations& sNormal, const PointRecord& sPoint) {
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        const PointSlot& sSlot = sPoint.asSlots[k];
        if (sSlot.nFlag != 1) continue;
        const ImageState& sImg = sAdj.asImages[k];
        const MeasurementRows sR = RowsOf(sImg, sSlot, sPoint.dfEstZ);
        const Displacement a = DisplacementOf(sImg, sSlot.dfXc);
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
        const double* P = sImg.P;
        const double* P0 = sImg.adfStart;
        const int nStart = BlockStart(sAdj, k);
        const double adfMisclosure[5] = {1.0 - P0[3] / P[3], P[4] - P0[4], P[5] - P0[5],
                                         1.0 - P0[6] / P[6], P[7] - P0[7]};
        const double adfWeight[5] = {W.W3, W.W4, W.W5, W.W6, W.W7};
        for (int i = 0; i < 5; ++i) {
            sNormal.ClearRow();
            sNormal.Row()[nStart + 3 + i] = 1.0;
            sNormal.AddRow(adfMisclosure[i], adfWeight[i]);
        }
    }
}

[[noreturn]] void ReportBadStart(std::size_t k, const char* pszWhat) {
    lumo::Fatal(lumo::Err::kComputation,
                MkName(_("Image %d: %s; check the segment's orbit and viewing angles.\n"),
                       static_cast<int>(k), pszWhat));
}

// Starting values of P0 ... P12 from the orbit and viewing geometry, image by
// image, and the constraint weights.
void ComputeStartingValues(Adjustment& sAdj) {
    const double a = sAdj.sEllipsoid.dfSemiMajor;
    const double e2 = sAdj.sEllipsoid.dfEcc2;
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        ImageState& sImg = sAdj.asImages[k];
        const EphemerisSeg_t& sSeg = *sImg.psSeg;
        double* P = sImg.P;
        const double phi = sSeg.dfCentreLatitude;
        const double tv = sSeg.dfViewAngle;
        const double psi = sSeg.dfPitchAngle;
        const double Rs = sSeg.dfOrbitRadius;
        const double inc = sSeg.dfInclination;
        const double ws = sSeg.dfAngularSpeed;
        const double vs = sSeg.dfSatVelocity;
        const double A1 = sImg.adfAttitude[0], A2 = sImg.adfAttitude[1], A3 = sImg.adfAttitude[2];

        const double phiC = std::atan((1.0 - e2) * std::tan(phi));
        const double D = 1.0 - e2 * std::cos(phiC) * std::cos(phiC);
        const double R = a * std::sqrt((1.0 - e2) / D);
        sImg.dfGeocLat = phiC;
        sImg.c0 = 2.0 * a / std::sqrt(1.0 - e2 * std::sin(phi) * std::sin(phi));
        const double delta = std::atan(e2 * std::sin(phiC) * std::cos(phiC) / D);
        const double beta = std::atan(std::tan(psi) / std::cos(tv));
        const double rho = Rs / R;
        const double alpha =
            std::asin(rho * std::asin(beta) / std::cos(std::asin(rho * std::sin(tv)) - tv)) - beta;
        const double gamma = std::atan(std::tan(tv) * std::cos(alpha) * std::cos(psi));
        const double eps = std::asin(rho * std::sin(gamma) / std::cos(alpha)) - gamma;
        const double q =
            (std::sin(eps) * std::sin(phiC) - std::cos(inc)) / (std::cos(eps) * std::cos(phiC));
        P[2] = std::asin(q);
        const double thetaP = tv + eps - q * delta;
        P[4] = std::tan(thetaP);
        const double kappa =
            std::asin(rho * std::sin(psi) * std::cos(eps)) - std::cos(P[2]) * delta;
        sImg.c6 = std::cos(kappa);
        P[7] = std::tan(kappa);
        sImg.c15 = P[4] / sImg.c6;
        const double Hs = Rs - std::cos(eps) * R * std::cos(alpha);
        P[3] = sImg.bFlat ? sSeg.dfPixelRes / sImg.c2
                          : Hs / (std::cos(tv) * std::cos(thetaP) * std::cos(psi));
        sImg.c9 =
            (P[4] * P[4] + 1.0) / (P[3] * sImg.c6) + 2.0 * (sImg.c15 * sImg.c15 + 1.0) / sImg.c0;
        const double cosP2 = std::cos(P[2]);
        const double L = std::tan(psi) * A2 +
                         ((vs - ws * R * cosP2 * delta * std::cos(eps)) / Hs) *
                             (2.0 * std::tan(tv) * std::sin(eps) + 1.0) +
                         2.0 * A1 * std::tan(tv);
        const double sRate = (vs - ws * Rs * cosP2 * delta * std::cos(eps)) / R;
        const double V = ((std::sin(psi) / (std::cos(psi + alpha) * std::cos(eps))) * std::cos(tv) /
                              std::cos(thetaP) * sRate +
                          ws * std::cos(eps) + kEarthRate * std::cos(phiC) * q +
                          (A2 - std::tan(tv) * A3) * Hs / R) *
                         R;
        P[6] = sImg.bFlat ? sSeg.dfLineRes : V * sSeg.dfLineInterval;
        P[5] = sImg.bFlat
                   ? 0.0
                   : -((std::sin(tv) * std::cos(alpha) / (std::cos(psi + alpha) * std::cos(eps))) /
                           std::cos(thetaP) * sRate -
                       cosP2 * std::cos(phiC) * kEarthRate + (P[3] / R) * A1) *
                         (R / V);
        P[11] = 0.0;
        P[12] = 0.0;
        P[10] = (ws * std::sin(eps - q * delta) - kEarthRate * std::sin(phiC) - A3 +
                 kEarthRate * cosP2 * P[7] * std::cos(phiC)) /
                V;
        P[8] = -(R / (V * V)) * ws * std::cos(eps) *
                   (0.5 * ws * std::sin(eps) - kEarthRate * std::sin(phiC)) -
               (P[5] / V) * L - 2.0 * P[4] * P[5] * P[5] / (sImg.c0 * sImg.c6);
        P[9] = L / V - P[5] * P[10] + 2.0 * P[5] * P[4] / (sImg.c0 * sImg.c6);
        for (int i = 2; i < kMaxUnknowns; ++i) {
            if (!std::isfinite(P[i])) ReportBadStart(k, "the starting values are not finite");
        }
        if (P[3] == 0.0 || P[6] == 0.0) ReportBadStart(k, "a starting scale is zero");

        // Centre offsets from the image's full control points.
        double dfSumX = 0.0, dfSumY = 0.0;
        int nUsed = 0;
        for (const PointRecord& sPoint : sAdj.asPoints) {
            const PointSlot& sSlot = sPoint.asSlots[k];
            if (sPoint.cType != 'X' || sSlot.nFlag != 1) continue;
            const double xc = sSlot.dfXc;
            const double t = -sSlot.dfYc * P[6];
            const double u = -(sImg.c2 * xc * P[3]) / (sImg.c2 * P[4] * xc + 1.0);
            const double H = sPoint.dfZ - u * u / sImg.c0;
            const double A0 = P[5] * t + u - sImg.c15 * H;
            const double B0 = P[7] * H + t;
            dfSumX += sPoint.dfX - A0 * std::cos(P[2]) - B0 * std::sin(P[2]);
            dfSumY += sPoint.dfY + A0 * std::sin(P[2]) - B0 * std::cos(P[2]);
            ++nUsed;
        }
        if (nUsed == 0) {
            ReportBadStart(k,
                           "no full control point is measured in this image, so its centre "
                           "cannot be placed");
        }
        P[0] = dfSumX / nUsed;
        P[1] = dfSumY / nUsed;
        std::copy(P, P + kMaxUnknowns, sImg.adfStart);
        const double w = sImg.sSetup.dfWeightFactor;
        sAdj.sWeights = {1700.0 * w, 1200.0 * w, 1700.0 * w * std::cos(phiC), 5000.0 * w,
                         1700.0 * w};
    }
}

// Applies the corrections of the solution to every image's parameters.
void UpdateParameters(Adjustment& sAdj, const double* pdfX) {
    int nStart = 0;
    for (ImageState& sImg : sAdj.asImages) {
        const int* anPos = sImg.Positions();
        for (int p = 0; p < kMaxUnknowns; ++p) {
            if (anPos[p] >= sImg.sSetup.nUnknowns) continue;
            const double dfCorrection = pdfX[nStart + anPos[p]];
            if (p == 3 || p == 6) {
                sImg.P[p] *= 1.0 + dfCorrection;  // relative unknowns
            } else {
                sImg.P[p] += dfCorrection;
            }
        }
        sImg.UpdateDerived();
        nStart += sImg.sSetup.nUnknowns;
    }
}

// Packed normal equations for nUnknowns unknowns; sizes the machine cannot
// hold are a clear error rather than a crash.
std::unique_ptr<NormalEquations> MakeNormalEquations(int nUnknowns) {
    const unsigned long long nSize = static_cast<unsigned long long>(nUnknowns) + 1ULL;
    const unsigned long long nElements = nSize * (nSize + 1ULL) / 2ULL;
    try {
        return std::make_unique<NormalEquations>(nUnknowns);
    } catch (const std::bad_alloc&) {
    } catch (const std::length_error&) {
    }
    lumo::Fatal(
        lumo::Err::kComputation,
        MkName(_("SRIT adjustment: the normal matrix of %d unknowns (%llu values) cannot be "
                 "allocated.\n"),
               nUnknowns, nElements));
}

// The fixed seven iterations: rows, constraints, solution, update, and the
// elevations of points without one re-estimated after each.
void RunIterations(Adjustment& sAdj) {
    int nUnknowns = 0;
    for (const ImageState& sImg : sAdj.asImages) nUnknowns += sImg.sSetup.nUnknowns;
    const std::unique_ptr<NormalEquations> psNormal = MakeNormalEquations(nUnknowns);
    NormalEquations& sNormal = *psNormal;
    std::vector<double> adfX(static_cast<std::size_t>(nUnknowns), 0.0);
    for (int nIteration = 0; nIteration < kIterations; ++nIteration) {
        sNormal.Clear();
        sAdj.dfMinControlWeight = 0.0;
        sAdj.dfLastRowWeight = 0.0;
        AddObservationRows(sAdj, sNormal);
        AddConstraintRows(sAdj, sNormal);
        if (!sNormal.Solve(adfX.data())) {
            LUMO_TRACE(1, "SRIT iteration %d: singular normal equations\n", nIteration + 1);
        }
        UpdateParameters(sAdj, adfX.data());
        EstimateElevations(sAdj, false);
    }
}

// Ellipsoid of the control points' projection.
Ellipsoid EllipsoidOf(const ProjInfo_t& sProj, const char* pszDecoded) {
    double a = 0.0, b = 0.0;
    if (sProj.nEarthModelKind == NOVA_EARTH_SPHEROID_PARMS) {
        const int k = sProj.nSpheroid;
        if (k >= 0 && k <= 19 && sProj.adfProjParms[0] == 0.0) {
            int nCode = 0;
            GetEllipsoidData(MkName("E%03d", k), &nCode, &a, &b);
        } else {
            a = sProj.adfProjParms[0];
            const double s = sProj.adfProjParms[1];
            if (s > 1.0) {
                b = s;
            } else if (s > 0.0) {
                b = std::sqrt(a * a - s * a * a);
            } else if (s == 0.0) {
                b = a;
            } else {
                lumo::FatalReal(lumo::Err::kUnit, "Earth model", s, 2);
            }
        }
    } else {
        int nCode = 0;
        GetEllipsoidData(pszDecoded, &nCode, &a, &b);
    }
    if (!(a > 0.0) || !(b > 0.0) || !(b <= a) || !std::isfinite(a)) {
        lumo::FatalReal(lumo::Err::kUnit, "Earth model", a, 2);
    }
    return {a, (a * a - b * b) / (a * a)};
}

void RequireConformal(const ProjInfo_t& sProj, char* pszDecoded) {
    DecodeGeosys(sProj.szProj, pszDecoded);
    if (IsConformal(pszDecoded)) return;
    lumo::PrintUserMessage(stdout,
                           "Invalid GCP unit! Unit must be one of the following :\n"
                           "UTM, KROV, LCC, MER, MSC, OM, PS, RSO, FOOT,\n"
                           "SG, SOM, SPCS, SPIF, SPAF, TM, UPS, METRE \n");
    lumo::FatalChar(lumo::Err::kUnit, "GCP Unit", pszDecoded);
}

void RequireArgument(const void* pv, const char* pszName) {
    if (pv != nullptr) return;
    lumo::Fatal(lumo::Err::kComputation,
                MkName(_("SRITCalculate: argument %s is null.\n"), pszName));
}

// Per-image values of the segment and the flags that follow from its name.
void LoadImage(ImageState& sImg, int nImage) {
    const EphemerisSeg_t& sSeg = *sImg.psSeg;
    sImg.bRadar = SegmentStartsWith(sSeg, "SAR");
    sImg.bConstrained = sSeg.nSupplementFlag != 0;
    sImg.c2 = sSeg.dfIFOV;
    sImg.c4 = sSeg.dfCentreColumn;
    sImg.c10 = sSeg.dfCentreLine;
    if (sSeg.nLevelConvForm > 0 && SegmentStartsWith(sSeg, "PLA")) {
        sImg.c4 = sImg.c10 = 3000.0;
    } else if (sSeg.nLevelConvForm > 0 && SegmentStartsWith(sSeg, "MLA")) {
        sImg.c4 = sImg.c10 = 1500.0;
    }
    const double adfScene[] = {sSeg.dfIFOV,        sSeg.dfViewAngle,    sSeg.dfCentreColumn,
                               sSeg.dfCentreLine,  sSeg.dfSatVelocity,  sSeg.dfAngularSpeed,
                               sSeg.dfInclination, sSeg.dfLineInterval, sSeg.dfCentreLatitude,
                               sSeg.dfOrbitRadius, sSeg.dfPitchAngle,   sSeg.dfPixelRes,
                               sSeg.dfLineRes};
    for (double dfValue : adfScene) {
        if (!std::isfinite(dfValue)) {
            lumo::Fatal(lumo::Err::kComputation,
                        MkName(_("Image %d: the segment holds a value that is not a number "
                                 "(%.17g); no model computed.\n"),
                               nImage, dfValue));
        }
    }
    if (!(sSeg.dfIFOV > 0.0))
        lumo::FatalReal(lumo::Err::kComputation, "Segment dfIFOV", sSeg.dfIFOV, 6);
    if (!(sSeg.dfOrbitRadius > 0.0)) {
        lumo::FatalReal(lumo::Err::kComputation, "Segment dfOrbitRadius", sSeg.dfOrbitRadius, 3);
    }
    const bool bLineTableSensor = SegmentStartsWith(sSeg, "PLA") || SegmentStartsWith(sSeg, "MLA");
    if (const AttitudeData_t* psRecord = AttitudeRecord(sSeg)) {
        sImg.adfAttitude[0] = psRecord->dfAttitude1;
        sImg.adfAttitude[1] = psRecord->dfAttitude2;
        sImg.adfAttitude[2] = psRecord->dfAttitude3;
    }
    if (bLineTableSensor) {
        if (const AttitudeData_t* psTable = AttitudeTable(&sSeg)) {
            sImg.bHasLineArrays = true;
            sImg.adfLineA.resize(static_cast<std::size_t>(psTable->nNumAttitudeLines));
            sImg.adfLineB.resize(sImg.adfLineA.size());
            for (std::size_t i = 0; i < sImg.adfLineA.size(); ++i) {
                sImg.adfLineA[i] = psTable->pAttitudeLines[i].dfValue1;
                sImg.adfLineB[i] = psTable->pAttitudeLines[i].dfValue2;
            }
        }
    }
}

// Sensor row and the name-derived groups of an image.
void SetupImage(ImageState& sImg) {
    // The unknown count follows the observations that enter the adjustment:
    // counting check observations too would let points that must not change
    // the solution raise it to more unknowns than the image can determine.
    sImg.sSetup = SetupFromSensorTable(*sImg.psSeg, sImg.nUsedObservations);
    const ImageSetup& s = sImg.sSetup;
    sImg.bFlat = ShortNameContains(s, "TM") || ShortNameContains(s, "ETM") ||
                 ShortNameContains(s, "IKONOS") || ShortNameContains(s, "L2");
    sImg.bLinearGroup = sImg.bFlat || ShortNameContains(s, "PLA") || ShortNameContains(s, "MLA");
    sImg.bFormosatPan = ShortNameContains(s, "FORMOSAT_PAN");
}

// Writes an image's result into its model record, which adopts the segment.
void FillRecord(const ImageState& sImg, SRITInfo_t* psModel, EphemerisSeg_t* psEphemeris,
                const ProjInfo_t& sProj) {
    const double* P = sImg.P;
    double* c = psModel->adfCoef;
    c[0] = sImg.c0;
    c[1] = P[5];
    c[2] = sImg.c2;
    c[3] = P[8];
    c[4] = sImg.c4;
    c[5] = P[9];
    c[6] = std::cos(std::atan(P[7]));
    c[7] = P[10];
    c[8] = P[2];
    c[15] = P[4] / c[6];
    c[9] = (P[4] * P[4] + 1.0) / (P[3] * c[6]) + 2.0 * (c[15] * c[15] + 1.0) / c[0];
    c[10] = sImg.c10;
    c[11] = P[6];
    c[12] = P[3];
    c[13] = P[7];
    c[14] = P[4];
    c[16] = P[0];
    c[17] = P[1];
    c[18] = P[12];
    c[19] = P[11];
    c[20] = c[21] = c[22] = 0.0;
    // The line arrays describe the adopted segment only: arrays of an
    // earlier segment would not match its table.
    std::free(psModel->padfLineShiftB);
    std::free(psModel->padfLineShiftA);
    psModel->padfLineShiftB = nullptr;
    psModel->padfLineShiftA = nullptr;
    if (sImg.bHasLineArrays) {
        const std::size_t n = sImg.adfLineA.size();
        psModel->padfLineShiftB = static_cast<double*>(HMalloc(n * sizeof(double)));
        psModel->padfLineShiftA = static_cast<double*>(HMalloc(n * sizeof(double)));
        std::copy(sImg.adfLineB.begin(), sImg.adfLineB.end(), psModel->padfLineShiftB);
        std::copy(sImg.adfLineA.begin(), sImg.adfLineA.end(), psModel->padfLineShiftA);
    }
    std::memcpy(psModel->Sensor, sImg.sSetup.szShortName, SRIT_SENSOR_SIZE);
    psModel->nSensor = sImg.sSetup.nSensor;
    psModel->nModelClass = GetModel(sImg.sSetup.nSensor);
    if (psModel->psEphemeris != psEphemeris) {
        LumoSatEphemerisFree(psModel->psEphemeris);
        psModel->psEphemeris = psEphemeris;
    }
    if (psModel->psProjInfo == nullptr) {
        psModel->psProjInfo = static_cast<ProjInfo_t*>(HCalloc(1, sizeof(ProjInfo_t)));
    }
    if (psModel->psProjInfo != &sProj) *psModel->psProjInfo = sProj;
}

// ---------------------------------------------------------------------------
// Transform helpers
// ---------------------------------------------------------------------------

bool IsLineTableSensor(int nSensor) {
    return nSensor == 0 || nSensor == 1;
}
bool IsLevelSensor(int nSensor) {
    return nSensor == 0 || nSensor == 1 || nSensor == 54 || nSensor == 55 || nSensor == 57;
}

// Entry l (counted from 1) of the segment's per-line table, or null.
const AttitudeLine_t* LineOf(const SRITInfo_t& sModel, long long l) {
    const AttitudeData_t* psTable = AttitudeTable(sModel.psEphemeris);
    if (psTable == nullptr || l < 1 || l > psTable->nNumAttitudeLines) return nullptr;
    return &psTable->pAttitudeLines[l - 1];
}

// Truncation toward zero that stays defined for any double.
long long TruncLine(double v) {
    if (!(std::abs(v) < 9e18)) return 0;
    return static_cast<long long>(v);
}

// Pixel and line shift of the FORMOSAT lens distortion at pixel p.
void LensShift(double p, double* pdfPixelShift, double* pdfLineShift) {
    const double d = p - 6000.0;
    const double r = std::sqrt(d * d + 748225.0);
    const double q = 0.0014496 * r - 6.9536888e-11 * r * r * r;
    *pdfPixelShift = d / r * q;
    *pdfLineShift = 865.0 / r * q;
}

bool Usable(const SRITInfo_t* psModel) {
    return psModel != nullptr && psModel->psEphemeris != nullptr;
}

void SetNull(double* pdfA, double* pdfB) {
    if (pdfA != nullptr) *pdfA = kNull;
    if (pdfB != nullptr) *pdfB = kNull;
}

// The elevation terms need at least two different elevations among the
// first nControlPoints points (those of them with an elevation).
void SpreadElevations(Adjustment& sAdj, std::size_t nControlPoints) {
    PointRecord* psFirst = nullptr;
    bool bSpread = false;
    for (std::size_t p = 0; p < nControlPoints; ++p) {
        PointRecord& sPoint = sAdj.asPoints[p];
        if (sPoint.cType != 'X') continue;
        if (psFirst == nullptr) psFirst = &sPoint;
        if (sPoint.dfZ != psFirst->dfZ) bSpread = true;
    }
    if (psFirst != nullptr && !bSpread) psFirst->dfZ += 1.0;
}

// Segment values, sensor rows, block positions and centred image coordinates.
void PrepareImages(Adjustment& sAdj) {
    int nStart = 0;
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        ImageState& sImg = sAdj.asImages[k];
        LoadImage(sImg, static_cast<int>(k));
        SetupImage(sImg);
        sImg.nBlockStart = nStart;
        nStart += sImg.sSetup.nUnknowns;
    }
    for (PointRecord& sPoint : sAdj.asPoints) {
        for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
            PointSlot& sSlot = sPoint.asSlots[k];
            if (sSlot.nFlag != 1 && sSlot.nFlag != 2) continue;
            sSlot.dfXc = sAdj.asImages[k].c4 - sSlot.dfPixel;
            sSlot.dfYc = sSlot.dfLine - sAdj.asImages[k].c10;
        }
    }
}

// Starting values, first elevations, the iterations, and a check that every
// image's parameters stayed numbers.
void Adjust(Adjustment& sAdj, const char* pszFunction) {
    ComputeStartingValues(sAdj);
    for (ImageState& sImage : sAdj.asImages) sImage.UpdateDerived();
    EstimateElevations(sAdj, true);
    RunIterations(sAdj);
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        for (int p = 0; p < kMaxUnknowns; ++p) {
            if (std::isfinite(sAdj.asImages[k].P[p])) continue;
            lumo::Fatal(lumo::Err::kComputation,
                        MkName(_("%s: the adjustment of image %d diverged (parameter %d is not a "
                                 "number); check the control points.\n"),
                               pszFunction, static_cast<int>(k), p));
        }
    }
}

}  // namespace

// ---------------------------------------------------------------------------
// Computation
// ---------------------------------------------------------------------------

int SRITCalculate_imp(SRITInfo_t* psModel, bool bImageFirst, EphemerisSeg_t* psEphemeris, int nGCP,
                      const ProjInfo_t* psProjInfo, const double* padfA, const double* padfB,
                      const double* padfZ, const double* padfC, const double* padfD) {
    if (nGCP < 3) return 0;
    RequireArgument(psModel, "psModel");
    RequireArgument(psEphemeris, "psEphemeris");
    RequireArgument(psProjInfo, "psProjInfo");
    RequireArgument(padfA, "padfA");
    RequireArgument(padfB, "padfB");
    RequireArgument(padfZ, "padfZ");
    RequireArgument(padfC, "padfC");
    RequireArgument(padfD, "padfD");

    char szDecoded[NOVA_GEOSYS_LEN] = {};
    RequireConformal(*psProjInfo, szDecoded);
    Adjustment sAdj;
    sAdj.sEllipsoid = EllipsoidOf(*psProjInfo, szDecoded);

    sAdj.asImages.resize(1);
    ImageState& sImg = sAdj.asImages[0];
    sImg.psSeg = psEphemeris;

    // Control points: one full control point per observation, all in image 0.
    const EphemerisSeg_t* apsSegs[1] = {psEphemeris};
    sAdj.asPoints.resize(static_cast<std::size_t>(nGCP));
    for (int i = 0; i < nGCP; ++i) {
        PointRecord& sPoint = sAdj.asPoints[static_cast<std::size_t>(i)];
        sPoint.cType = 'X';
        sPoint.nInUse = 1;
        sPoint.dfSdX = sPoint.dfSdY = sPoint.dfSdZ = 1.0;
        sPoint.asSlots.resize(1);
        PointSlot& sSlot = sPoint.asSlots[0];
        sSlot.nFlag = 1;
        sSlot.dfPixel = bImageFirst ? padfA[i] : padfC[i];
        sSlot.dfLine = bImageFirst ? padfB[i] : padfD[i];
        sPoint.dfX = bImageFirst ? padfC[i] : padfA[i];
        sPoint.dfY = bImageFirst ? padfD[i] : padfB[i];
        sPoint.dfZ = padfZ[i];
        const double adfValues[] = {sSlot.dfPixel, sSlot.dfLine, sPoint.dfX, sPoint.dfY,
                                    sPoint.dfZ};
        for (double dfValue : adfValues) {
            if (!std::isfinite(dfValue) || dfValue == kNull) {
                lumo::Fatal(lumo::Err::kComputation,
                            MkName(_("GCP number %d has an invalid coordinate (%.17g).\n"), i + 1,
                                   dfValue));
            }
        }
        if (psEphemeris->nLevelConvForm > 0) {
            SPOT1BTo1AControlPoint_imp(apsSegs, 0, &sSlot.dfPixel, &sSlot.dfLine);
        }
    }
    sImg.nObservations = nGCP;
    sImg.nUsedObservations = nGCP;
    SpreadElevations(sAdj, sAdj.asPoints.size());
    PrepareImages(sAdj);
    Adjust(sAdj, "SRITCalculate");
    FillRecord(sAdj.asImages[0], psModel, psEphemeris, *psProjInfo);
    return 1;
}

namespace {

// Line tags of the block adjustment's debug messages.
constexpr int kNotEnoughPointsLine = 1100;
constexpr int kSensorLine = 1268;

// An identifier of SRIT_ID_SIZE characters as a case-insensitive key.
std::string IdKey(const char* pszIds, int nIndex) {
    const char* psz = pszIds + static_cast<std::size_t>(nIndex) * SRIT_ID_SIZE;
    std::string osKey(psz, SRIT_ID_SIZE);
    for (char& c : osKey) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    return osKey;
}

// The identifier as printable text (up to its first terminator, blanks trimmed).
std::string IdText(const char* pszIds, int nIndex) {
    const char* psz = pszIds + static_cast<std::size_t>(nIndex) * SRIT_ID_SIZE;
    std::size_t n = 0;
    while (n < SRIT_ID_SIZE && psz[n] != '\0') ++n;
    while (n > 0 && psz[n - 1] == ' ') --n;
    return std::string(psz, n);
}

double Optional(const double* padf, int i) {
    return padf != nullptr ? padf[i] : kNull;
}

// A coordinate must be a number; the null value means "not given" where the
// caller allows it.
void RequireCoordinate(double dfValue, bool bNullAllowed, const char* pszWhat, int nObservation,
                       const char* pszName) {
    if (std::isfinite(dfValue) && (bNullAllowed || dfValue != kNull)) return;
    lumo::Fatal(lumo::Err::kComputation,
                MkName(_("SRITCalculateN: %s observation %d has an invalid %s (%.17g).\n"), pszWhat,
                       nObservation, pszName, dfValue));
}

// The caller's arrays of one block adjustment.
struct BlockInput {
    int nImages;
    const char* pszImageIds;
    bool bImageFirst;
    EphemerisSeg_t** papsEphemeris;
    int nGCP;
    const char *pszGcpImageIds, *pszGcpPointIds, *pszGcpUsage;
    const double *padfA, *padfB, *padfZ, *padfSdA, *padfSdB, *padfSdZ;
    const double *padfC, *padfD, *padfSdC, *padfSdD;
    int nTie;
    const char *pszTieImageIds, *pszTiePointIds;
    const double *padfTiePixel, *padfTieLine;
    double* padfTieZ;
    const double *padfTieSdPixel, *padfTieSdLine, *padfTieSdZ;
};

// Image number of an observation's image identifier; an unknown identifier is
// a clear error.
std::size_t FindImage(const std::unordered_map<std::string, std::size_t>& mapImages,
                      const char* pszIds, int nIndex, const char* pszWhat) {
    const auto it = mapImages.find(IdKey(pszIds, nIndex));
    if (it != mapImages.end()) return it->second;
    lumo::Fatal(lumo::Err::kComputation,
                MkName(_("SRITCalculateN: %s observation %d names image \"%s\", which is not among "
                         "the images of the block.\n"),
                       pszWhat, nIndex + 1, IdText(pszIds, nIndex).c_str()));
}

// Point record of an identifier, made on its first appearance.
PointRecord& FindPoint(Adjustment& sAdj, std::unordered_map<std::string, std::size_t>& mapPoints,
                       std::vector<int>& anFirstObservation, const std::string& osKey,
                       int nObservation) {
    const auto it = mapPoints.find(osKey);
    if (it != mapPoints.end()) return sAdj.asPoints[it->second];
    mapPoints.emplace(osKey, sAdj.asPoints.size());
    anFirstObservation.push_back(nObservation);
    sAdj.asPoints.emplace_back();
    PointRecord& sPoint = sAdj.asPoints.back();
    sPoint.asSlots.resize(sAdj.asImages.size());
    return sPoint;
}

// Control-point observations: points 0 ... G-1, with their types.
void AddControlObservations(Adjustment& sAdj, const BlockInput& in,
                            const std::unordered_map<std::string, std::size_t>& mapImages,
                            std::vector<int>& anFirstObservation) {
    std::unordered_map<std::string, std::size_t> mapPoints;
    const bool bF = in.bImageFirst;
    for (int i = 0; i < in.nGCP; ++i) {
        const int n = i + 1;
        const std::size_t k = FindImage(mapImages, in.pszGcpImageIds, i, "control-point");
        PointRecord& sPoint =
            FindPoint(sAdj, mapPoints, anFirstObservation, IdKey(in.pszGcpPointIds, i), i);
        ImageState& sImg = sAdj.asImages[k];
        PointSlot& sSlot = sPoint.asSlots[k];
        sPoint.nInUse = 1;
        sSlot.nFlag = in.pszGcpUsage[i] == 'A' ? 1 : 2;
        ++sImg.nObservations;
        sSlot.dfPixel = bF ? in.padfA[i] : in.padfC[i];
        sSlot.dfLine = bF ? in.padfB[i] : in.padfD[i];
        sPoint.dfX = bF ? in.padfC[i] : in.padfA[i];
        sPoint.dfY = bF ? in.padfD[i] : in.padfB[i];
        sPoint.dfZ = in.padfZ[i];
        RequireCoordinate(sSlot.dfPixel, false, "control-point", n, "pixel");
        RequireCoordinate(sSlot.dfLine, false, "control-point", n, "line");
        RequireCoordinate(sPoint.dfX, true, "control-point", n, "X");
        RequireCoordinate(sPoint.dfY, true, "control-point", n, "Y");
        RequireCoordinate(sPoint.dfZ, true, "control-point", n, "Z");
        const double dfSdPixel = Optional(bF ? in.padfSdA : in.padfSdC, i);
        const double dfSdLine = Optional(bF ? in.padfSdB : in.padfSdD, i);
        // Image standard deviations are given in pixels and kept in ground units.
        sSlot.dfSdPixel = dfSdPixel == kNull ? kNull : dfSdPixel * sImg.psSeg->dfPixelRes;
        sSlot.dfSdLine = dfSdLine == kNull ? kNull : dfSdLine * sImg.psSeg->dfLineRes;
        sPoint.dfSdX = Optional(bF ? in.padfSdC : in.padfSdA, i);
        sPoint.dfSdY = Optional(bF ? in.padfSdD : in.padfSdB, i);
        sPoint.dfSdZ = Optional(in.padfSdZ, i);
        const bool bPlan = sPoint.dfX != kNull && sPoint.dfY != kNull;
        if (bPlan && sPoint.dfZ != kNull) {
            sPoint.cType = 'X';
        } else if (bPlan) {
            sPoint.cType = 'P';
        } else {
            lumo::Fatal(lumo::Err::kComputation, MkName(_("GCP number %d has invalid type.\n"), n));
        }
        if (sImg.psSeg->nLevelConvForm > 0) {
            SPOT1BTo1AControlPoint_imp(in.papsEphemeris, static_cast<int>(k), &sSlot.dfPixel,
                                       &sSlot.dfLine);
        }
    }
}

// Tie observations: points G ... G+T-1. A tie point keeps an elevation once
// one of its observations has given it.
void AddTieObservations(Adjustment& sAdj, const BlockInput& in,
                        const std::unordered_map<std::string, std::size_t>& mapImages,
                        std::vector<std::size_t>& anTiePoint) {
    std::unordered_map<std::string, std::size_t> mapPoints;
    std::vector<int> anFirst;
    for (int i = 0; i < in.nTie; ++i) {
        const int n = i + 1;
        const std::size_t k = FindImage(mapImages, in.pszTieImageIds, i, "tie");
        const std::string osKey = IdKey(in.pszTiePointIds, i);
        const bool bNew = mapPoints.find(osKey) == mapPoints.end();
        PointRecord& sPoint = FindPoint(sAdj, mapPoints, anFirst, osKey, i);
        anTiePoint.push_back(static_cast<std::size_t>(&sPoint - sAdj.asPoints.data()));
        PointSlot& sSlot = sPoint.asSlots[k];
        if (bNew) sPoint.cType = 'H';
        sPoint.nInUse = 1;
        sSlot.nFlag = 1;
        sSlot.dfPixel = in.padfTiePixel[i];
        sSlot.dfLine = in.padfTieLine[i];
        RequireCoordinate(sSlot.dfPixel, false, "tie", n, "pixel");
        RequireCoordinate(sSlot.dfLine, false, "tie", n, "line");
        RequireCoordinate(in.padfTieZ[i], true, "tie", n, "elevation");
        sSlot.dfSdPixel = Optional(in.padfTieSdPixel, i);
        sSlot.dfSdLine = Optional(in.padfTieSdLine, i);
        if (in.padfTieZ[i] != kNull) {
            sPoint.dfZ = in.padfTieZ[i];
            sPoint.cType = 'A';
            const double dfSdZ = Optional(in.padfTieSdZ, i);
            if (dfSdZ != kNull) sPoint.dfSdZ = dfSdZ;
        }
        if (sAdj.asImages[k].psSeg->nLevelConvForm > 0) {
            SPOT1BTo1AControlPoint_imp(in.papsEphemeris, static_cast<int>(k), &sSlot.dfPixel,
                                       &sSlot.dfLine);
        }
    }
}

// Control points whose observation in an image enters the adjustment (a
// point measured twice in one image counts once: its slot holds one).
void CountUsedObservations(Adjustment& sAdj, std::size_t nControlPoints) {
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        int nUsed = 0;
        for (std::size_t p = 0; p < nControlPoints; ++p) {
            nUsed += sAdj.asPoints[p].asSlots[k].nFlag == 1 ? 1 : 0;
        }
        sAdj.asImages[k].nUsedObservations = nUsed;
    }
}

// Every image needs 4 control-point observations (5 for radar).
bool EnoughPoints(const Adjustment& sAdj) {
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        const ImageState& sImg = sAdj.asImages[k];
        const int nNeeded = SegmentStartsWith(*sImg.psSeg, "SAR") ? 5 : 4;
        if (sImg.nObservations >= nNeeded) continue;
        if (lumo::TraceOn()) {
            lumo::Trace(1, __FILE__, kNotEnoughPointsLine,
                        "Not enough points in image %d! no model calculated\n",
                        static_cast<int>(k));
        }
        return false;
    }
    return true;
}

// Pairs of images whose viewing-angle tangents differ by at least half the
// largest difference in the block.
void BuildPairs(Adjustment& sAdj) {
    const std::size_t n = sAdj.asImages.size();
    if (n < 2) return;
    double dfMax = 0.0;
    for (std::size_t i = 0; i < n; ++i) {
        for (std::size_t j = i + 1; j < n; ++j) {
            dfMax = std::max(dfMax, std::abs(std::tan(sAdj.asImages[i].psSeg->dfViewAngle) -
                                             std::tan(sAdj.asImages[j].psSeg->dfViewAngle)));
        }
    }
    for (std::size_t i = 0; i < n; ++i) {
        for (std::size_t j = i + 1; j < n; ++j) {
            const double dfDiff = std::abs(std::tan(sAdj.asImages[i].psSeg->dfViewAngle) -
                                           std::tan(sAdj.asImages[j].psSeg->dfViewAngle));
            if (dfDiff >= 0.5 * dfMax) sAdj.asPairs.push_back({i, j, dfDiff});
        }
    }
}

void RequireInput(const BlockInput& in, SRITInfo_t* const* papsModels) {
    RequireArgument(in.pszImageIds, "pszImageIds");
    RequireArgument(papsModels, "papsModels");
    RequireArgument(in.papsEphemeris, "papsEphemeris");
    RequireArgument(in.pszGcpImageIds, "pszGcpImageIds");
    RequireArgument(in.pszGcpPointIds, "pszGcpPointIds");
    RequireArgument(in.pszGcpUsage, "pszGcpUsage");
    RequireArgument(in.padfA, "padfA");
    RequireArgument(in.padfB, "padfB");
    RequireArgument(in.padfZ, "padfZ");
    RequireArgument(in.padfC, "padfC");
    RequireArgument(in.padfD, "padfD");
    if (in.nTie < 0)
        lumo::FatalReal(lumo::Err::kComputation, "Number of tie observations", in.nTie, 0);
    if (in.nTie == 1) {
        lumo::Fatal(lumo::Err::kComputation,
                    _("SRITCalculateN: a single tie observation ties nothing; a tie point needs "
                      "observations in at least two images.\n"));
    }
    if (in.nTie > 0) {
        RequireArgument(in.pszTieImageIds, "pszTieImageIds");
        RequireArgument(in.pszTiePointIds, "pszTiePointIds");
        RequireArgument(in.padfTiePixel, "padfTiePixel");
        RequireArgument(in.padfTieLine, "padfTieLine");
        RequireArgument(in.padfTieZ, "padfTieZ");
    }
    for (int k = 0; k < in.nImages; ++k) {
        RequireArgument(papsModels[k], "papsModels[k]");
        RequireArgument(in.papsEphemeris[k], "papsEphemeris[k]");
        for (int j = 0; j < k; ++j) {
            // Each record adopts its segment and releases the one it held:
            // a shared segment, or a record holding another image's new
            // segment, would be released while still in use.
            const bool bCrossed = papsModels[j]->psEphemeris == in.papsEphemeris[k] ||
                                  papsModels[k]->psEphemeris == in.papsEphemeris[j];
            if (papsModels[j] == papsModels[k] || in.papsEphemeris[j] == in.papsEphemeris[k] ||
                bCrossed) {
                lumo::Fatal(lumo::Err::kComputation,
                            MkName(_("SRITCalculateN: images %d and %d share a model record or a "
                                     "segment; each image needs its own.\n"),
                                   j, k));
            }
        }
    }
}

// Report of the control points measured in more than one image.
struct ReportOutputs {
    int* pnReported;
    char* pszIds;
    int* panImages;
    double *padfGivenX, *padfGivenY, *padfGivenZ;
    double *padfEstX, *padfEstY, *padfEstZ;
    double *padfResX, *padfResY, *padfResZ;
};

template <typename T>
void Put(T* pa, int i, T value) {
    if (pa != nullptr) pa[i] = value;
}

void WriteReport(const Adjustment& sAdj, std::size_t nControlPoints, const BlockInput& in,
                 const std::vector<int>& anFirstObservation, const ReportOutputs& out) {
    int nReported = 0;
    for (std::size_t p = 0; p < nControlPoints; ++p) {
        const PointRecord& sPoint = sAdj.asPoints[p];
        int nCount = 0;
        for (const PointSlot& sSlot : sPoint.asSlots) nCount += sSlot.nFlag != 0 ? 1 : 0;
        if (nCount <= 1) continue;
        if (out.pszIds != nullptr) {
            std::memcpy(
                out.pszIds + static_cast<std::size_t>(nReported) * SRIT_ID_SIZE,
                in.pszGcpPointIds + static_cast<std::size_t>(anFirstObservation[p]) * SRIT_ID_SIZE,
                SRIT_ID_SIZE);
        }
        Put(out.panImages, nReported, nCount);
        Put(out.padfGivenX, nReported, sPoint.dfX);
        Put(out.padfGivenY, nReported, sPoint.dfY);
        Put(out.padfGivenZ, nReported, sPoint.dfZ);
        Put(out.padfEstX, nReported, sPoint.dfEstX);
        Put(out.padfEstY, nReported, sPoint.dfEstY);
        Put(out.padfEstZ, nReported, sPoint.dfEstZ);
        Put(out.padfResX, nReported, sPoint.dfResX);
        Put(out.padfResY, nReported, sPoint.dfResY);
        Put(out.padfResZ, nReported, sPoint.dfResZ);
        ++nReported;
    }
    if (out.pnReported != nullptr) *out.pnReported = nReported;
}

}  // namespace

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
                       double* padfResidualX, double* padfResidualY, double* padfResidualZ) {
    if (nGCP < 3) return 0;
    // Checked before anything is allocated for the images.
    if (nImages > SRIT_MAX_IMAGES) {
        lumo::Fatal(lumo::Err::kBadArgument, _("Number of images has exceeded limit.\n"));
    }
    if (nImages < 1) lumo::FatalReal(lumo::Err::kComputation, "Number of images", nImages, 0);
    RequireArgument(psProjInfo, "psProjInfo");
    const BlockInput in{nImages,        pszImageIds,    bImageFirst, papsEphemeris, nGCP,
                        pszGcpImageIds, pszGcpPointIds, pszGcpUsage, padfA,         padfB,
                        padfZ,          padfSdA,        padfSdB,     padfSdZ,       padfC,
                        padfD,          padfSdC,        padfSdD,     nTie,          pszTieImageIds,
                        pszTiePointIds, padfTiePixel,   padfTieLine, padfTieZ,      padfTieSdPixel,
                        padfTieSdLine,  padfTieSdZ};
    RequireInput(in, papsModels);

    char szDecoded[NOVA_GEOSYS_LEN] = {};
    RequireConformal(*psProjInfo, szDecoded);
    Adjustment sAdj;
    sAdj.sEllipsoid = EllipsoidOf(*psProjInfo, szDecoded);

    sAdj.asImages.resize(static_cast<std::size_t>(nImages));
    std::unordered_map<std::string, std::size_t> mapImages;
    for (int k = 0; k < nImages; ++k) {
        sAdj.asImages[static_cast<std::size_t>(k)].psSeg = papsEphemeris[k];
        mapImages.emplace(IdKey(pszImageIds, k), static_cast<std::size_t>(k));  // first wins
    }
    std::vector<int> anFirstObservation;
    AddControlObservations(sAdj, in, mapImages, anFirstObservation);
    const std::size_t nControlPoints = sAdj.asPoints.size();
    std::vector<std::size_t> anTiePoint;
    AddTieObservations(sAdj, in, mapImages, anTiePoint);
    if (!EnoughPoints(sAdj)) return 0;
    CountUsedObservations(sAdj, nControlPoints);

    SpreadElevations(sAdj, nControlPoints);
    PrepareImages(sAdj);
    BuildPairs(sAdj);
    Adjust(sAdj, "SRITCalculateN");
    EstimatePoints(sAdj);

    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        FillRecord(sAdj.asImages[k], papsModels[k], papsEphemeris[k], *psProjInfo);
        if (lumo::TraceOn()) {
            const std::string osSensor(papsModels[k]->Sensor,
                                       strnlen(papsModels[k]->Sensor, SRIT_SENSOR_SIZE));
            lumo::Trace(1, __FILE__, kSensorLine, "SRITModel[i]->Sensor=%s\n", osSensor.c_str());
        }
    }
    for (int i = 0; i < nTie; ++i) {
        const PointRecord& sPoint = sAdj.asPoints[anTiePoint[static_cast<std::size_t>(i)]];
        if (padfTieX != nullptr) padfTieX[i] = sPoint.dfEstX;
        if (padfTieY != nullptr) padfTieY[i] = sPoint.dfEstY;
        padfTieZ[i] = sPoint.dfEstZ;
    }
    // Check observations join for the reported estimates.
    for (std::size_t p = 0; p < nControlPoints; ++p) {
        for (PointSlot& sSlot : sAdj.asPoints[p].asSlots) {
            if (sSlot.nFlag == 2) sSlot.nFlag = 1;
        }
    }
    EstimatePoints(sAdj);
    const ReportOutputs out{pnReported,     pszReportedIds, panReportedImages, padfGivenX,
                            padfGivenY,     padfGivenZ,     padfEstimatedX,    padfEstimatedY,
                            padfEstimatedZ, padfResidualX,  padfResidualY,     padfResidualZ};
    WriteReport(sAdj, nControlPoints, in, anFirstObservation, out);
    return 1;
}

// ---------------------------------------------------------------------------
// Ground and image transforms
// ---------------------------------------------------------------------------

void toutin_imp(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ, double* pdfPixel,
                double* pdfLine) {
    if (!Usable(psModel)) {
        SetNull(pdfPixel, pdfLine);
        return;
    }
    const double* c = psModel->adfCoef;
    const int M = psModel->nModelClass;
    const int S = psModel->nSensor;
    const double h = dfZ;
    const double s = std::sin(c[8]), co = std::cos(c[8]);
    const double dX = dfX - c[16], dY = dfY - c[17];
    const double y = dY * co + dX * s;  // along track
    const double x = dX * co - dY * s;  // across track
    const double E = M == 6 ? c[21] * x * x * x : c[21] * x * y * y;
    const double X1 = (x - c[1] * y) * (1.0 + 2.0 * h / c[0]) + c[3] * y * y + c[5] * x * y - E;
    const double H = M == 2 ? h : h - x * x / c[0];
    const double dfRootP4 = std::sqrt(c[14] * c[14] + 1.0);
    double Q = 0.0;
    if (std::abs(c[18]) >= 1e-7) {
        const double r = X1 / c[12];
        Q = ((1.0 - c[14] * r) / (dfRootP4 * std::sqrt(r * r + 1.0)) * c[18] *
                 (H * H / (2.0 * c[12]) + H) -
             (X1 + c[14] * H / c[6])) /
            (c[14] * X1 + c[12] - H);
    } else {
        Q = -(X1 + c[14] * H / c[6]) / (c[14] * X1 + c[12] - H);
    }
    const double W = c[12] * Q / (c[14] * Q + 1.0);
    const double G = H * c[13];
    const double Yc = y - G;
    double dfDen = c[19] * y + 1.0 + c[7] * W;
    if (M == 5) dfDen += c[20] * y * y + c[22] * H;
    const double tau = Yc / dfDen;
    const double K = (H * H / (2.0 * c[12]) + H) * c[18] /
                     std::sqrt((c[2] * c[2] + 1.0) * (c[14] * c[14] + 1.0));
    double L0 = 0.0;
    if (M == 5) {
        L0 = -(Yc / (c[19] * tau + 1.0 + c[7] * W + c[22] * H + c[20] * tau * tau)) / c[11];
    } else if (M == 6) {
        L0 = -(Yc / (c[19] * tau + 1.0 + c[7] * W)) / c[11];
    } else {
        L0 = (G - y + c[7] * tau * W + c[19] * tau * tau) / c[11];
    }
    if (IsLineTableSensor(S)) {
        if (const AttitudeLine_t* psLine = LineOf(*psModel, TruncLine(c[10] + L0 + 0.5))) {
            L0 += psLine->dfValue1 / c[11];
        }
    }
    double dfLine = c[10] + L0;
    const double yp = -L0 * c[11], xp = -W;
    const double E2 = M == 6 ? c[21] * xp * xp * xp : c[21] * xp * yp * yp;
    const double X2 =
        (x - c[1] * yp) * (1.0 + 2.0 * h / c[0]) + c[3] * yp * yp + c[5] * xp * yp - E2;
    const double D = (c[14] * X2 + c[12] - H - c[14] * K) * c[2];
    double P = 0.0;
    const long long l2 = TruncLine(dfLine + 0.5);
    if (IsLineTableSensor(S) && l2 >= 1 && l2 <= psModel->psEphemeris->nNumLines) {
        const AttitudeLine_t* psLine = LineOf(*psModel, l2);
        const double v = psLine != nullptr ? psLine->dfValue2 : 0.0;
        P = (v - (c[14] * H / c[6] + X2) + K) / D;
    } else {
        P = (K - (c[14] * H / c[6] + X2)) / D;
    }
    if (M == 6) {
        const double Wr = P * c[2] * c[12] / (c[14] * c[2] * P + 1.0);
        const double xr = -Wr;
        const double yr =
            ((y - H * c[13]) / (1.0 - xr * c[7] - c[11] * L0 * c[19]) / c[11]) * c[11];
        const double X3 = (x - c[1] * yr) * (1.0 + 2.0 * h / c[0]) + c[3] * yr * yr +
                          c[5] * xr * yr - c[21] * xr * xr * xr;
        P = (K - (c[14] * H / c[6] + X3)) / ((c[14] * X3 + c[12] - H - c[14] * K) * c[2]);
    }
    double dfPixel = c[4] - P;
    if (S == 50) {
        double dfPixelShift = 0.0, dfLineShift = 0.0;
        LensShift(dfPixel, &dfPixelShift, &dfLineShift);
        dfPixel -= dfPixelShift;
        dfLine -= dfLineShift;
    }
    *pdfPixel = dfPixel;
    *pdfLine = dfLine;
}

void toutin_1_imp(const SRITInfo_t* psModel, double dfXc, double dfYc, double dfZ, double* pdfX,
                  double* pdfY) {
    if (!Usable(psModel)) {
        SetNull(pdfX, pdfY);
        return;
    }
    const double* c = psModel->adfCoef;
    const int M = psModel->nModelClass;
    const int S = psModel->nSensor;
    const double h = dfZ;
    double xc = dfXc, yc = dfYc;
    if (S == 50) {
        const double p = c[4] - xc;
        double dfPixelShift = 0.0, dfLineShift = 0.0;
        LensShift(p, &dfPixelShift, &dfLineShift);
        xc = c[4] - (p + dfPixelShift);
        yc += dfLineShift;
    }
    const long long l = TruncLine(yc + c[10] + 0.5);
    const double s = std::sin(c[8]), co = std::cos(c[8]);
    const double t = -yc * c[11];
    const double u = -c[12] * c[2] * xc / (c[14] * c[2] * xc + 1.0);
    const double H = M == 2 ? h : h - u * u / c[0];
    const double F = (c[1] - t * c[3] - u * c[5]) * t + (1.0 - 2.0 * h / c[0]) * u -
                     ((c[14] * c[14] + 1.0) / c[12] * u + c[15]) * H;
    double A = 0.0, B = 0.0;
    if (S == 0 || S == 1 || S == 30 || S == 31) {
        double s1 = 0.0, s2 = 0.0;
        if (IsLineTableSensor(S)) {
            if (const AttitudeLine_t* psLine = LineOf(*psModel, l)) {
                s1 = psLine->dfValue2;
                s2 = psLine->dfValue1;
            }
        }
        A = F + s1;
        B = (1.0 - u * c[7]) * t + H * c[13] + s2;
    } else if (M == 5) {
        A = F + c[21] * u * t * t;
        B = (1.0 - u * c[7]) * t + H * c[13] + c[19] * t * t + c[20] * t * t * t + c[22] * H * t;
    } else {
        if (std::abs(c[18]) >= 1e-7) {
            const double g =
                (c[14] * c[2] * xc + 1.0) /
                (std::sqrt((c[2] * xc) * (c[2] * xc) + 1.0) * std::sqrt(c[14] * c[14] + 1.0));
            A = F + g * c[18] * (H * H / (2.0 * c[12]) + H);
        } else {
            A = F;
        }
        if (M == 6) A += c[21] * u * u * u;
        B = (1.0 - u * c[7]) * t + H * c[13] + c[19] * t * t;
    }
    *pdfX = c[16] + A * co + B * s;
    *pdfY = c[17] - A * s + B * co;
}

void SRITGeo2Img_imp(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ,
                     double* pdfPixel, double* pdfLine) {
    if (!Usable(psModel)) {
        SetNull(pdfPixel, pdfLine);
        return;
    }
    double dfPixel = 0.0, dfLine = 0.0;
    toutin_imp(psModel, dfX, dfY, dfZ, &dfPixel, &dfLine);
    if (psModel->nModelClass == 6) {
        // Radar-like class: refine with the inverse until the ground closes
        // to 10 ground units, at most four rounds.
        for (int nRound = 0; nRound < 4; ++nRound) {
            double dfX2 = 0.0, dfY2 = 0.0;
            toutin_1_imp(psModel, psModel->adfCoef[4] - dfPixel, dfLine - psModel->adfCoef[10], dfZ,
                         &dfX2, &dfY2);
            const double dX = dfX2 - dfX, dY = dfY2 - dfY;
            if (std::abs(dX) < 10.0 && std::abs(dY) < 10.0) {
                *pdfPixel = dfPixel;
                *pdfLine = dfLine;
                return;
            }
            toutin_imp(psModel, dfX - dX, dfY - dY, dfZ, &dfPixel, &dfLine);
        }
    }
    if (IsLevelSensor(psModel->nSensor)) SPOT1ATo1B_imp(psModel, &dfPixel, &dfLine);
    *pdfPixel = dfPixel;
    *pdfLine = dfLine;
}

int SRITImg2Geo_imp(const SRITInfo_t* psModel, double dfPixel, double dfLine, double dfZ,
                    double* pdfX, double* pdfY) {
    if (dfZ == kNull || !Usable(psModel)) {
        SetNull(pdfX, pdfY);
        return 0;
    }
    if (IsLevelSensor(psModel->nSensor) && psModel->psEphemeris->nLevelConvForm > 0) {
        SPOT1BTo1A_imp(psModel, &dfPixel, &dfLine);
    }
    toutin_1_imp(psModel, psModel->adfCoef[4] - dfPixel, dfLine - psModel->adfCoef[10], dfZ, pdfX,
                 pdfY);
    return 1;
}

int SRITImg2GeoDem_imp(const SRITInfo_t* psModel, double dfPixel, double dfLine, double* pdfZ,
                       double* pdfX, double* pdfY) {
    SetNull(pdfX, pdfY);
    if (pdfZ == nullptr) return 0;
    if (*pdfZ == kNull) *pdfZ = 0.0;
    SRITImg2Geo_imp(psModel, dfPixel, dfLine, *pdfZ, pdfX, pdfY);
    return 1;
}

int SRITGeo2ImgExact(const SRITInfo_t* psModel, double dfX, double dfY, double dfZ,
                     double* pdfPixel, double* pdfLine) {
    SetNull(pdfPixel, pdfLine);
    if (!Usable(psModel) || !std::isfinite(dfX) || !std::isfinite(dfY) || !std::isfinite(dfZ) ||
        dfZ == kNull) {
        return 0;
    }
    const double* c = psModel->adfCoef;
    // Newton's method on the image-to-ground equations, in the model's own
    // (level 1A) image geometry, started from the ground-to-image equations.
    double p = 0.0, l = 0.0;
    toutin_imp(psModel, dfX, dfY, dfZ, &p, &l);
    auto Ground = [&](double dfP, double dfL, double* pdfGX, double* pdfGY) {
        toutin_1_imp(psModel, c[4] - dfP, dfL - c[10], dfZ, pdfGX, pdfGY);
    };
    bool bClosed = false;
    for (int nStep = 0; nStep < 30 && !bClosed; ++nStep) {
        if (!std::isfinite(p) || !std::isfinite(l)) return 0;
        double gx = 0.0, gy = 0.0, gxp = 0.0, gyp = 0.0, gxl = 0.0, gyl = 0.0;
        const double d = 1e-3;
        Ground(p, l, &gx, &gy);
        Ground(p + d, l, &gxp, &gyp);
        Ground(p, l + d, &gxl, &gyl);
        const double j11 = (gxp - gx) / d, j21 = (gyp - gy) / d;
        const double j12 = (gxl - gx) / d, j22 = (gyl - gy) / d;
        const double det = j11 * j22 - j12 * j21;
        if (!(std::abs(det) > 0.0) || !std::isfinite(det)) return 0;
        const double rx = dfX - gx, ry = dfY - gy;
        const double dp = (j22 * rx - j12 * ry) / det;
        const double dl = (-j21 * rx + j11 * ry) / det;
        p += dp;
        l += dl;
        bClosed = std::abs(dp) < 1e-9 && std::abs(dl) < 1e-9;
    }
    if (!bClosed) return 0;
    if (IsLevelSensor(psModel->nSensor)) SPOT1ATo1B_imp(psModel, &p, &l);
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
        return;
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
