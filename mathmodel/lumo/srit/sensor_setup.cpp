// Sensor set-up of the rigorous model: the sensor table that decides an
// image's unknown count, weight and accuracy, the per-image values taken from
// the segment, and the centred image coordinates of the observations.
#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstddef>
#include <cstdio>
#include <cstring>
#include <string>

#include "errors.h"
#include "runtime.h"
#include "segment_access.h"
#include "srit/srit_internal.h"

namespace lumo {
namespace srit {
namespace {

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
            SensorNameStartsWith(sSeg, sRow.pszPrefix) ||
            (sRow.pszAltPrefix != nullptr && SensorNameStartsWith(sSeg, sRow.pszAltPrefix));
        if (!bPrefix) continue;
        // Walk the group's sub-rows (a plain row is its own group of one).
        for (std::size_t j = i;
             j < nRows && std::strcmp(kSensorTable[j].pszPrefix, sRow.pszPrefix) == 0; ++j) {
            const SensorRow& sSub = kSensorTable[j];
            if (sSub.pszSub != nullptr && !SensorNameStartsWith(sSeg, sSub.pszSub)) continue;
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

// Per-image values of the segment and the flags that follow from its name.
void LoadImage(ImageState& sImg, int nImage) {
    const EphemerisSeg_t& sSeg = *sImg.psSeg;
    sImg.bRadar = SensorNameStartsWith(sSeg, "SAR");
    sImg.bConstrained = sSeg.nSupplementFlag != 0;
    ModelTerms& m = sImg.sTerms;
    m.dfIfov = sSeg.dfIFOV;
    m.dfCentreColumn = sSeg.dfCentreColumn;
    m.dfCentreLine = sSeg.dfCentreLine;
    // Level-1A scenes of these sensors are centred on fixed image positions.
    if (sSeg.nLevelConvForm > 0 && SensorNameStartsWith(sSeg, "PLA")) {
        m.dfCentreColumn = m.dfCentreLine = 3000.0;
    } else if (sSeg.nLevelConvForm > 0 && SensorNameStartsWith(sSeg, "MLA")) {
        m.dfCentreColumn = m.dfCentreLine = 1500.0;
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
    const bool bLineTableSensor =
        SensorNameStartsWith(sSeg, "PLA") || SensorNameStartsWith(sSeg, "MLA");
    if (const AttitudeData_t* psRecord = AttitudeRecordOf(&sSeg)) {
        sImg.adfAttitude[0] = psRecord->dfAttitude1;
        sImg.adfAttitude[1] = psRecord->dfAttitude2;
        sImg.adfAttitude[2] = psRecord->dfAttitude3;
    }
    // The adjustment reads the per-line shifts at trunc(yc + centre line).
    if (bLineTableSensor) m.psLineTable = AttitudeLinesOf(&sSeg);
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
    Selectors& f = sImg.sTerms.sSelect;
    f.bLinear = sImg.bFlat || ShortNameContains(s, "PLA") || ShortNameContains(s, "MLA");
    f.bCurvature = !sImg.bFlat;
    f.bLens = ShortNameContains(s, "FORMOSAT_PAN");
}

}  // namespace

bool ShortNameContains(const ImageSetup& sSetup, const char* pszText) {
    return std::strstr(sSetup.szShortName, pszText) != nullptr;
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
            sSlot.dfXc = sAdj.asImages[k].sTerms.dfCentreColumn - sSlot.dfPixel;
            sSlot.dfYc = sSlot.dfLine - sAdj.asImages[k].sTerms.dfCentreLine;
        }
    }
}

}  // namespace srit
}  // namespace lumo
