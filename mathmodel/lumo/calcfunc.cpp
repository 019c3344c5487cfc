// Generic dispatch of point transforms by model code.
#include <cmath>

#include "lumo_ap.h"
#include "lumo_dispatch.h"
#include "lumo_lrs.h"
#include "lumo_poly.h"
#include "lumo_rf.h"
#include "lumo_rtcs.h"
#include "lumo_srit.h"
#include "lumo_tps.h"
#include "mathmodel_core.h"

namespace {

constexpr int kFirstCode = 1;
constexpr int kLastCode = 12;

bool IsKnownCode(int nModelCode) {
    return nModelCode >= kFirstCode && nModelCode <= kLastCode;
}

bool IsModelObjectCode(int nModelCode) {
    return nModelCode >= 10 && nModelCode <= 12;
}

// A null record or output would crash the family; it is refused as a failed
// transform instead of being dereferenced.
bool HasRecordAndOutputs(const void* pModel, const double* pdfOut1, const double* pdfOut2) {
    return pModel != nullptr && pdfOut1 != nullptr && pdfOut2 != nullptr;
}

const nova::mathmodel::IMathModel* AsModelObject(void* pModel) {
    return static_cast<const nova::mathmodel::IMathModel*>(pModel);
}

// A family that gives the null value, or a value that is not finite, has not
// mapped the point, whatever status it returns.
int OnlyPositions(int nResult, double dfA, double dfB) {
    const bool bPosition = std::isfinite(dfA) && std::isfinite(dfB) && dfA != LUMO_NULL_VALUE &&
                           dfB != LUMO_NULL_VALUE;
    return nResult != 0 && bPosition ? 1 : 0;
}

int DispatchGeo2Img(int nModelCode, void* pModel, double dfX, double dfY, double dfZ,
                    double* pdfPixel, double* pdfLine);
int DispatchImg2GeoDem(int nModelCode, void* pModel, double dfPixel, double dfLine, double* pdfZ,
                       double* pdfX, double* pdfY);

}  // namespace

extern "C" LUMO_API const char* LumoVersion() {
    return LUMO_VERSION_STRING;
}

int GenGeo2Img(int nModelCode, void* pModel, double dfX, double dfY, double dfZ, double* pdfPixel,
               double* pdfLine) {
    const int nResult = DispatchGeo2Img(nModelCode, pModel, dfX, dfY, dfZ, pdfPixel, pdfLine);
    return nResult != 0 ? OnlyPositions(nResult, *pdfPixel, *pdfLine) : 0;
}

int GenImg2GeoDem(int nModelCode, void* pModel, double dfPixel, double dfLine, double* pdfZ,
                  double* pdfX, double* pdfY) {
    const int nResult = DispatchImg2GeoDem(nModelCode, pModel, dfPixel, dfLine, pdfZ, pdfX, pdfY);
    return nResult != 0 ? OnlyPositions(nResult, *pdfX, *pdfY) : 0;
}

namespace {

int DispatchGeo2Img(int nModelCode, void* pModel, double dfX, double dfY, double dfZ,
                    double* pdfPixel, double* pdfLine) {
    if (!IsKnownCode(nModelCode)) return 0;
    if (!HasRecordAndOutputs(pModel, pdfPixel, pdfLine)) return 0;
    switch (nModelCode) {
        case LUMO_CODE_AP:
            APGeo2Img(static_cast<const APInfo_t*>(pModel), dfX, dfY, dfZ, pdfPixel, pdfLine);
            return 1;
        case LUMO_CODE_SRIT:
            SRITGeo2Img(static_cast<const SRITInfo_t*>(pModel), dfX, dfY, dfZ, pdfPixel, pdfLine);
            return 1;
        case LUMO_CODE_POLY:
            POLYGeo2Img(static_cast<const POLYInfo_t*>(pModel), dfX, dfY, pdfPixel, pdfLine);
            return 1;
        case LUMO_CODE_TPS:
            TPSGeo2Img(static_cast<TPSMInfo_t*>(pModel), dfX, dfY, pdfPixel, pdfLine);
            return 1;
        case LUMO_CODE_RF:
            RFGeo2Img(static_cast<RFInfo_t*>(pModel), dfX, dfY, dfZ, pdfPixel, pdfLine);
            return 1;
        case LUMO_CODE_RTCS:
            return RTCSGeo2Img(static_cast<const RTCSInfo_t*>(pModel), dfX, dfY, dfZ, pdfPixel,
                               pdfLine);
        case LUMO_CODE_LRS:
            // 0 when the point is not seen by the pass (line -10000, pixel 0).
            return LRSGeodeticToImage(static_cast<const LRSOrbitModel_t*>(pModel), dfX, dfY, dfZ,
                                      pdfPixel, pdfLine);
        default:
            break;
    }
    if (IsModelObjectCode(nModelCode)) {
        return AsModelObject(pModel)->GroundToImage(dfX, dfY, dfZ, *pdfPixel, *pdfLine, false) == 0
                   ? 1
                   : 0;
    }
    // Families that have not joined the dispatch yet, code 8 and code 9.
    return 0;
}

int DispatchImg2GeoDem(int nModelCode, void* pModel, double dfPixel, double dfLine, double* pdfZ,
                       double* pdfX, double* pdfY) {
    if (!IsKnownCode(nModelCode)) return 0;
    if (!HasRecordAndOutputs(pModel, pdfX, pdfY) || pdfZ == nullptr) return 0;
    switch (nModelCode) {
        case LUMO_CODE_AP:
            return APImg2GeoDem(static_cast<const APInfo_t*>(pModel), dfPixel, dfLine, pdfZ, pdfX,
                                pdfY) != 0
                       ? 1
                       : 0;
        case LUMO_CODE_SRIT:
            return SRITImg2GeoDem(static_cast<const SRITInfo_t*>(pModel), dfPixel, dfLine, pdfZ,
                                  pdfX, pdfY) != 0
                       ? 1
                       : 0;
        case LUMO_CODE_LRS:
            // The line of sight meets the ellipsoid at the given height (0 when
            // none is given); the height is not written back.
            return LRSImageToGeodeticAtHeight(static_cast<const LRSOrbitModel_t*>(pModel), dfPixel,
                                              dfLine, *pdfZ == LUMO_NULL_VALUE ? 0.0 : *pdfZ, pdfX,
                                              pdfY);
        case LUMO_CODE_POLY:
            POLYImg2Geo(static_cast<const POLYInfo_t*>(pModel), dfPixel, dfLine, pdfX, pdfY);
            return 1;
        case LUMO_CODE_TPS:
            TPSImg2Geo(static_cast<TPSMInfo_t*>(pModel), dfPixel, dfLine, pdfX, pdfY);
            return 1;
        case LUMO_CODE_RF:
            // The inverse starts from the model's own guess, not from the caller's values.
            *pdfX = LUMO_NULL_VALUE;
            *pdfY = LUMO_NULL_VALUE;
            return RFImg2Geo(static_cast<RFInfo_t*>(pModel), dfPixel, dfLine, pdfX, pdfY, pdfZ) != 0
                       ? 1
                       : 0;
        case LUMO_CODE_RTCS:
            return RTCSImg2GeoDem(static_cast<const RTCSInfo_t*>(pModel), dfPixel, dfLine, pdfZ,
                                  pdfX, pdfY) != 0
                       ? 1
                       : 0;
        default:
            break;
    }
    if (nModelCode == LUMO_CODE_OBJECT_IMAGE_TO_GROUND || IsModelObjectCode(nModelCode)) {
        // A model object needs a real height: there is no terrain to consult.
        if (*pdfZ == LUMO_NULL_VALUE) return 0;
        return AsModelObject(pModel)->ImageToGround(dfPixel, dfLine, *pdfZ, *pdfX, *pdfY, false) ==
                       0
                   ? 1
                   : 0;
    }
    return 0;
}

}  // namespace

int GenImg2Geo(int nModelCode, void* pModel, double dfPixel, double dfLine, double dfZ,
               double* pdfX, double* pdfY) {
    double dfHeight = dfZ;  // whatever the family writes back is discarded
    return GenImg2GeoDem(nModelCode, pModel, dfPixel, dfLine, &dfHeight, pdfX, pdfY);
}

namespace nova {
namespace mathmodel {

LumoModelType ModelCodeToLumoType(int nModelCode) {
    switch (nModelCode) {
        case 1:
            return LUMO_MODEL_AP;
        case 2:
            return LUMO_MODEL_SRIT;
        case 3:
            return LUMO_MODEL_LRS;
        case 4:
            return LUMO_MODEL_POLY;
        case 5:
            return LUMO_MODEL_TPS;
        case 6:
            return LUMO_MODEL_RF;
        case 7:
            return LUMO_MODEL_RTCS;
        case 10:
            return LUMO_MODEL_CODE10;
        case 11:
            return LUMO_MODEL_CODE11;
        case 12:
            return LUMO_MODEL_CODE12;
        default:
            return LUMO_MODEL_NONE;
    }
}

}  // namespace mathmodel
}  // namespace nova

// ---------------------------------------------------------------------------
// Sensor catalogue: sensor codes from sensor names and model classes from
// sensor codes, both as fixed tables.
// ---------------------------------------------------------------------------
#include <cstddef>
#include <cstring>

#include "errors.h"
#include "lumo_sensor.h"
#include "runtime.h"
#include "segment_access.h"

namespace {

// One test on the sensor name: a case-insensitive prefix, or the whole name.
struct SensorNameTest {
    const char* pszText;  // null: no test
    bool bWholeName;
};

constexpr SensorNameTest Prefix(const char* pszText) {
    return {pszText, false};
}
constexpr SensorNameTest WholeName(const char* pszText) {
    return {pszText, true};
}
constexpr SensorNameTest kNoTest = {nullptr, false};

// One row of the name catalogue. Rows with a group prefix are the group's
// members and stand together; once a name begins with the prefix only those
// rows are tried. Where dfResolution is non-zero, a pixel size exactly equal
// to it selects nCodeAtResolution instead of nCode.
struct SensorNameRow {
    const char* pszGroup;
    SensorNameTest sTest;
    SensorNameTest sAltTest;
    int nCode;
    double dfResolution;
    int nCodeAtResolution;
};

constexpr SensorNameRow Row(SensorNameTest sTest, int nCode) {
    return {nullptr, sTest, kNoTest, nCode, 0.0, 0};
}
constexpr SensorNameRow RowAlt(SensorNameTest sTest, SensorNameTest sAlt, int nCode) {
    return {nullptr, sTest, sAlt, nCode, 0.0, 0};
}
constexpr SensorNameRow RowByRes(SensorNameTest sTest, SensorNameTest sAlt, int nCode,
                                 double dfResolution, int nCodeAtResolution) {
    return {nullptr, sTest, sAlt, nCode, dfResolution, nCodeAtResolution};
}
constexpr SensorNameRow Member(const char* pszGroup, SensorNameTest sTest, int nCode) {
    return {pszGroup, sTest, kNoTest, nCode, 0.0, 0};
}
constexpr SensorNameRow MemberAlt(const char* pszGroup, SensorNameTest sTest, SensorNameTest sAlt,
                                  int nCode) {
    return {pszGroup, sTest, sAlt, nCode, 0.0, 0};
}

// clang-format off
constexpr SensorNameRow kSensorNames[] = {
    Row(Prefix("AVHRR"), 185),
    Row(Prefix("PLA"), 0),
    Row(Prefix("MLA"), 1),
    Row(Prefix("ASTER"), 8),
    RowByRes(Prefix("SAR"), WholeName("RADARSAT_2"), 9, 6.25, 26),
    Member("LISS", Prefix("LISS-1"), 10),
    Member("LISS", Prefix("LISS-2"), 11),
    Member("LISS", Prefix("LISS-3"), 12),
    Member("LISS", Prefix("LISS-L3-L2"), 14),
    Member("LISS", Prefix("LISS-L3"), 13),
    Member("LISS", Prefix("LISS-L4-L2"), 16),
    Member("LISS", Prefix("LISS-L4"), 15),
    Member("LISS", Prefix("LISS-P3-L2"), 18),
    Member("LISS", Prefix("LISS-P3"), 17),
    Member("LISS", Prefix("LISS-W3-L2"), 20),
    Member("LISS", Prefix("LISS-W3"), 19),
    Member("LISS", Prefix("LISS-M3"), 23),
    Member("LISS", Prefix("LISS-AWF-L2"), 22),
    Member("LISS", Prefix("LISS-AWF"), 21),
    Row(Prefix("EOC"), 24),
    Row(Prefix("IRS"), 25),
    Row(Prefix("MSS"), 186),
    RowByRes(Prefix("TM"), kNoTest, 30, 15.0, 31),
    Row(Prefix("ETM"), 31),
    RowByRes(Prefix("IKO"), kNoTest, 32, 4.0, 33),
    RowByRes(Prefix("ORBVIEW"), kNoTest, 34, 4.0, 35),
    Member("OV", Prefix("OV3_PAN_BASIC"), 36),
    Member("OV", Prefix("OV3_PAN_GEO"), 37),
    Member("OV", Prefix("OV3_MULTI_BASIC"), 38),
    Member("OV", Prefix("OV3_MULTI_GEO"), 39),
    Member("OV", Prefix("OV5_PAN_BASIC"), 40),
    Member("OV", Prefix("OV5_PAN_GEO"), 41),
    Member("OV", Prefix("OV5_MULTI_BASIC"), 42),
    Member("OV", Prefix("OV5_MULTI_GEO"), 43),
    Row(Prefix("QBIRD_PAN_STD"), 45),
    Row(Prefix("QBIRD_PAN_STH"), 46),
    Row(Prefix("QBIRD_PAN"), 44),
    Row(Prefix("QBIRD_MULTI_STD"), 48),
    Row(Prefix("QBIRD_MULTI_STH"), 49),
    Row(Prefix("QBIRD_MULTI"), 47),
    RowAlt(Prefix("WVIEW1_PAN_STD"), Prefix("WVIEW_PAN_STD"), 94),
    RowAlt(Prefix("WVIEW1_PAN"), Prefix("WVIEW_PAN"), 93),
    Row(Prefix("WVIEW_MULTI_STD"), 96),
    Row(Prefix("WVIEW_MULTI"), 95),
    Member("FORMOSAT", Prefix("FORMOSAT_PAN_L2"), 52),
    Member("FORMOSAT", Prefix("FORMOSAT_MULTIL2"), 53),
    Member("FORMOSAT", Prefix("FORMOSAT_PAN"), 50),
    Member("FORMOSAT", Prefix("FORMOSAT_MULTI"), 51),
    Row(Prefix("MERIS_FR"), 58),
    Row(Prefix("MERIS_RR"), 59),
    Row(Prefix("MERIS_LR"), 60),
    Row(Prefix("ASAR"), 61),
    Row(Prefix("EROS"), 62),
    Row(Prefix("MODIS_1000"), 65),
    Row(Prefix("MODIS_500"), 64),
    Row(Prefix("MODIS_250"), 63),
    Member("CBERS", Prefix("CBERS_HRC_L2"), 67),
    Member("CBERS", Prefix("CBERS_HRC"), 66),
    Member("CBERS", Prefix("CBERS_CCD_L2"), 69),
    Member("CBERS", Prefix("CBERS_CCD"), 68),
    Member("CBERS", Prefix("CBERS_IRM_80_L2"), 71),
    Member("CBERS", Prefix("CBERS_IRM_80"), 70),
    Member("CBERS", Prefix("CBERS_IRM_160_L2"), 73),
    Member("CBERS", Prefix("CBERS_IRM_160"), 72),
    Member("CBERS", Prefix("CBERS_WFI_L2"), 75),
    Member("CBERS", Prefix("CBERS_WFI"), 74),
    Member("CBERS", Prefix("CBERS4_PAN_1"), 178),
    Member("CBERS", Prefix("CBERS4_MS_1"), 179),
    Member("CBERS", Prefix("CBERS4_PAN_2"), 180),
    Member("CBERS", Prefix("CBERS4_MS_2"), 181),
    Member("CBERS", Prefix("CBERS4_THM_1"), 182),
    Member("CBERS", Prefix("CBERS4_THM_2"), 183),
    Row(Prefix("CARTOSAT1_L1"), 76),
    Row(Prefix("CARTOSAT1_L2"), 77),
    Row(Prefix("DMC_1R"), 83),
    Row(Prefix("ALOS_PRISM_L1"), 78),
    Row(Prefix("ALOS_PRISM_L2"), 79),
    Row(Prefix("ALOS_AVNIR_L1"), 80),
    Row(Prefix("ALOS_AVNIR_L2"), 81),
    Row(Prefix("PALSAR"), 82),
    Member("KOMPSAT", Prefix("KOMPSAT2_PAN"), 84),
    Member("KOMPSAT", Prefix("KOMPSAT2_MULTI"), 85),
    Member("KOMPSAT", Prefix("KOMPSAT3_PAN"), 86),
    Member("KOMPSAT", Prefix("KOMPSAT3_PSH"), 88),
    Member("KOMPSAT", Prefix("KOMPSAT3_MS"), 87),
    Member("KOMPSAT", Prefix("KOMPSAT3A_PAN"), 89),
    Member("KOMPSAT", Prefix("KOMPSAT3A_PSH"), 91),
    Member("KOMPSAT", Prefix("KOMPSAT3A_MS"), 90),
    Row(Prefix("TERRASAR"), 92),
    Row(Prefix("RAPIDEYE"), 97),
    Row(Prefix("RESOURCESAT"), 175),
    Row(Prefix("THEOS_PAN_L1"), 98),
    Row(Prefix("THEOS_PAN_L2"), 99),
    Row(Prefix("THEOS_MS_L1"), 100),
    Row(Prefix("THEOS_MS_L2"), 101),
    Member("GOSAT", Prefix("GOSAT_500_L1"), 102),
    Member("GOSAT", Prefix("GOSAT_500_L2"), 103),
    Member("GOSAT", Prefix("GOSAT_1500_L1"), 104),
    Member("GOSAT", Prefix("GOSAT_1500_L2"), 105),
    MemberAlt("HJ", Prefix("HJ_CCD_1A"), Prefix("HJ1A"), 106),
    MemberAlt("HJ", Prefix("HJ_CCD_1B"), Prefix("HJ1B"), 107),
    Member("HJ", Prefix("HJ1C"), 172),
    Row(Prefix("RASAT_PAN"), 122),
    Row(Prefix("RASAT_MS"), 123),
    Member("SPOT", Prefix("SPOT5_PAN_2_5"), 54),
    Member("SPOT", Prefix("SPOT5_PAN_5"), 55),
    Member("SPOT", Prefix("SPOT5_HRS"), 56),
    Member("SPOT", Prefix("SPOT5_MULTI"), 57),
    Member("SPOT", Prefix("SPOT6_PAN"), 116),
    Member("SPOT", Prefix("SPOT6_MS"), 117),
    Member("SPOT", Prefix("SPOT6_PSH"), 118),
    Member("SPOT", Prefix("SPOT7_PAN"), 119),
    Member("SPOT", Prefix("SPOT7_MS"), 120),
    Member("SPOT", Prefix("SPOT7_PSH"), 121),
    Member("PLEIADES", Prefix("PLEIADES_PAN_L1"), 108),
    Member("PLEIADES", Prefix("PLEIADES_MS_L1"), 109),
    Member("PLEIADES", Prefix("PLEIADES_PAN_L2"), 110),
    Member("PLEIADES", Prefix("PLEIADES_MS_L2"), 111),
    Member("SSOT", Prefix("SSOT_PAN_L1"), 112),
    Member("SSOT", Prefix("SSOT_MS_L1"), 113),
    Member("SSOT", Prefix("SSOT_PAN_L2"), 114),
    Member("SSOT", Prefix("SSOT_MS_L2"), 115),
    Row(Prefix("TH01_DGP"), 124),
    Row(Prefix("TH01_GFB"), 125),
    Row(Prefix("TH01_SXZ"), 126),
    Member("ZY", Prefix("ZY3_NAD"), 130),
    Member("ZY", Prefix("ZY3_FWD"), 131),
    Member("ZY", Prefix("ZY3_BWD"), 132),
    Member("ZY", Prefix("ZY3_MUX"), 133),
    Member("ZY", Prefix("ZY3_TLC"), 134),
    Member("ZY", Prefix("ZY1_02C_HRC"), 127),
    Member("ZY", Prefix("ZY1_02C_PMS_PAN"), 128),
    Member("ZY", Prefix("ZY1_02C_PMS_MS"), 129),
    Row(Prefix("GK2_PAN"), 135),
    Row(Prefix("GK2_MS"), 136),
    Row(Prefix("MRC_RED"), 138),
    Row(Prefix("MRC_BLU"), 140),
    Row(Prefix("MRC_GRN"), 139),
    Row(Prefix("MRC_NIR"), 141),
    Member("GF", Prefix("GF1_PMS_PAN"), 142),
    Member("GF", Prefix("GF2_PMS_PAN"), 145),
    Member("GF", Prefix("GF1_PMS_MS"), 143),
    Member("GF", Prefix("GF2_PMS_MS"), 146),
    Member("GF", Prefix("GF1_WFV"), 144),
    Row(Prefix("HRC"), 137),
    Row(Prefix("SJ9_PAN"), 147),
    Row(Prefix("SJ9_MUX"), 148),
    Row(Prefix("SJ9_PMS_PAN"), 149),
    Row(Prefix("SJ9_PMS_MS"), 150),
    Row(Prefix("YG2_1"), 151),
    Row(Prefix("YG8_1"), 152),
    Row(Prefix("YG14_1"), 153),
    Row(Prefix("UAVSAR"), 154),
    Member("ALSAT", Prefix("ALSAT2_PAN_1A"), 157),
    Member("ALSAT", Prefix("ALSAT2_MS_1A"), 158),
    Member("ALSAT", Prefix("ALSAT2_PAN_2A"), 159),
    Member("ALSAT", Prefix("ALSAT2_MS_2A"), 160),
    Member("DUBAI", Prefix("DUBAISAT2_PAN"), 161),
    Member("DUBAI", Prefix("DUBAISAT2_MS"), 162),
    Member("KAZEOSAT", Prefix("KAZEOSAT1_PAN_1A"), 163),
    Member("KAZEOSAT", Prefix("KAZEOSAT1_MS_1A"), 164),
    Member("KAZEOSAT", Prefix("KAZEOSAT1_PAN_2A"), 165),
    Member("KAZEOSAT", Prefix("KAZEOSAT1_MS_2A"), 166),
    Member("KAZEOSAT", Prefix("KAZEOSAT2_MS_1G"), 167),
    Member("DEIMOS", WholeName("DEIMOS1_MS_1R"), 168),
    Member("DEIMOS", Prefix("DEIMOS2_PAN_1B"), 169),
    Member("DEIMOS", WholeName("DEIMOS2_MS_1B"), 170),
    Member("DEIMOS", Prefix("DEIMOS2_PSH_1B"), 171),
    Member("TRIPLESAT", Prefix("TRIPLESAT_PAN"), 173),
    Member("TRIPLESAT", Prefix("TRIPLESAT_MS"), 174),
    Member("JL", Prefix("JL101A_PAN"), 176),
    Member("JL", Prefix("JL101A_MS"), 177),
    Row(Prefix("HI_RES"), 155),
    Row(Prefix("MED_RES"), 156),
    Row(Prefix("NEW"), 184),
};
// clang-format on

// Case-insensitive (ASCII letters only) test of the first nNameLen characters
// of pszName against one name test.
bool NameMatches(const char* pszName, std::size_t nNameLen, const SensorNameTest& sTest) {
    if (sTest.pszText == nullptr) return false;
    const std::size_t nTextLen = std::strlen(sTest.pszText);
    if (nNameLen < nTextLen) return false;
    if (sTest.bWholeName && nNameLen != nTextLen) return false;
    return lumo::NameHasPrefix(pszName, nNameLen, sTest.pszText);
}

int CodeOfRow(const SensorNameRow& sRow, double dfPixelRes) {
    const bool bAtResolution = sRow.dfResolution != 0.0 && dfPixelRes == sRow.dfResolution;
    return bAtResolution ? sRow.nCodeAtResolution : sRow.nCode;
}

bool RowMatches(const SensorNameRow& sRow, const char* pszName, std::size_t nNameLen) {
    return NameMatches(pszName, nNameLen, sRow.sTest) ||
           NameMatches(pszName, nNameLen, sRow.sAltTest);
}

bool InGroup(const SensorNameRow& sRow, const char* pszGroup) {
    return sRow.pszGroup != nullptr && std::strcmp(sRow.pszGroup, pszGroup) == 0;
}

// One group of model classes: sensor codes nFirst..nLast have class nClass.
struct ModelClassRange {
    int nClass;
    int nFirst;
    int nLast;
};

// clang-format off
constexpr ModelClassRange kModelClasses[] = {
    {0, 0, 7}, {0, 184, 184},
    {1, 8, 8}, {1, 10, 13}, {1, 15, 15}, {1, 17, 17}, {1, 19, 19}, {1, 21, 21}, {1, 23, 25},
    {1, 55, 57}, {1, 63, 65}, {1, 68, 68}, {1, 70, 70}, {1, 72, 72}, {1, 74, 74}, {1, 80, 81},
    {1, 102, 102}, {1, 104, 104}, {1, 122, 123}, {1, 136, 136}, {1, 144, 144}, {1, 152, 152},
    {1, 156, 156}, {1, 178, 179}, {1, 182, 182},
    {2, 14, 14}, {2, 16, 16}, {2, 18, 18}, {2, 20, 20}, {2, 22, 22}, {2, 30, 31}, {2, 67, 67},
    {2, 69, 69}, {2, 71, 71}, {2, 73, 73}, {2, 75, 75}, {2, 79, 79}, {2, 83, 83}, {2, 103, 103},
    {2, 105, 105}, {2, 110, 111}, {2, 114, 115}, {2, 159, 160}, {2, 167, 167}, {2, 175, 175},
    {2, 180, 181}, {2, 183, 183}, {2, 186, 186},
    {3, 9, 9}, {3, 26, 29}, {3, 32, 33}, {3, 37, 37}, {3, 39, 39}, {3, 41, 41}, {3, 43, 43},
    {3, 45, 45}, {3, 48, 48}, {3, 52, 53}, {3, 61, 61}, {3, 77, 77}, {3, 82, 82}, {3, 92, 92},
    {3, 94, 94}, {3, 96, 96}, {3, 172, 172},
    {4, 34, 36}, {4, 38, 38}, {4, 40, 40}, {4, 42, 42}, {4, 44, 44}, {4, 47, 47}, {4, 54, 54},
    {4, 66, 66}, {4, 76, 76}, {4, 78, 78}, {4, 84, 91}, {4, 93, 93}, {4, 95, 95}, {4, 97, 97},
    {4, 108, 109}, {4, 112, 113}, {4, 116, 121}, {4, 124, 135}, {4, 138, 143}, {4, 145, 151},
    {4, 153, 153}, {4, 155, 155}, {4, 157, 158}, {4, 161, 164}, {4, 168, 171}, {4, 173, 174},
    {4, 176, 177},
    {5, 46, 46}, {5, 49, 51}, {5, 62, 62}, {5, 137, 137},
    {6, 58, 60}, {6, 98, 101}, {6, 106, 107}, {6, 165, 166},
    {LUMO_UNKNOWN_SENSOR, 154, 154}, {LUMO_UNKNOWN_SENSOR, 185, 185},
};
// clang-format on

}  // namespace

int GetSensor(EphemerisSeg_t* psSeg) {
    if (psSeg == nullptr) return LUMO_UNKNOWN_SENSOR;
    // The name field may fill its whole array without a terminator.
    const char* pszName = psSeg->szSensorName;
    const std::size_t nNameLen = strnlen(pszName, sizeof(psSeg->szSensorName));
    const std::size_t nRows = sizeof(kSensorNames) / sizeof(kSensorNames[0]);
    std::size_t i = 0;
    while (i < nRows) {
        const SensorNameRow& sRow = kSensorNames[i];
        if (sRow.pszGroup == nullptr) {
            if (RowMatches(sRow, pszName, nNameLen)) return CodeOfRow(sRow, psSeg->dfPixelRes);
            ++i;
            continue;
        }
        // A group: once its prefix matches, only its own rows decide.
        const bool bInGroup = NameMatches(pszName, nNameLen, Prefix(sRow.pszGroup));
        for (; i < nRows && InGroup(kSensorNames[i], sRow.pszGroup); ++i) {
            if (bInGroup && RowMatches(kSensorNames[i], pszName, nNameLen)) {
                return CodeOfRow(kSensorNames[i], psSeg->dfPixelRes);
            }
        }
        if (bInGroup) return LUMO_UNKNOWN_SENSOR;
    }
    return LUMO_UNKNOWN_SENSOR;
}

int GetModel(int nSensor) {
    LUMO_TRACE(1, "Get Model nSensor=%d\n", nSensor);
    if (nSensor < 0 || nSensor > LUMO_MAX_SENSOR_CODE) return LUMO_UNKNOWN_SENSOR;
    for (const ModelClassRange& sRange : kModelClasses) {
        if (nSensor >= sRange.nFirst && nSensor <= sRange.nLast) return sRange.nClass;
    }
    return LUMO_UNKNOWN_SENSOR;
}
