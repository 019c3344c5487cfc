// Sensor catalogue: every catalogue row, the matching rules and the model
// classes of every sensor code.
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <limits>
#include <map>
#include <sstream>
#include <string>
#include <vector>

#include "lumo.h"
#include "runtime.h"

namespace {

EphemerisSeg_t SegmentNamed(const std::string& osName, double dfPixelRes = 10.0) {
    EphemerisSeg_t sSeg{};
    std::strncpy(sSeg.szSensorName, osName.c_str(), sizeof(sSeg.szSensorName) - 1);
    sSeg.dfPixelRes = dfPixelRes;
    return sSeg;
}

int SensorOf(const std::string& osName, double dfPixelRes = 10.0) {
    EphemerisSeg_t sSeg = SegmentNamed(osName, dfPixelRes);
    return GetSensor(&sSeg);
}

struct CatalogueCase {
    const char* pszStep;
    const char* pszName;
    double dfPixelRes;
    int nExpected;
    bool bWholeName;
};

std::ostream& operator<<(std::ostream& os, const CatalogueCase& c) {
    return os << c.pszStep << " " << c.pszName << " @" << c.dfPixelRes << " -> " << c.nExpected;
}

// The catalogue, one case per row (rows choosing by pixel size have one case
// for each side), in catalogue order.
const CatalogueCase kCatalogue[] = {
    {"1", "AVHRR", 10, 185, false},
    {"2", "PLA", 10, 0, false},
    {"3", "MLA", 10, 1, false},
    {"4", "ASTER", 10, 8, false},
    {"5", "SAR", 10, 9, false},
    {"5", "SAR", 6.25, 26, false},
    {"5", "RADARSAT_2", 10, 9, true},
    {"5", "RADARSAT_2", 6.25, 26, true},
    {"6a", "LISS-1", 10, 10, false},
    {"6b", "LISS-2", 10, 11, false},
    {"6c", "LISS-3", 10, 12, false},
    {"6d", "LISS-L3-L2", 10, 14, false},
    {"6e", "LISS-L3", 10, 13, false},
    {"6f", "LISS-L4-L2", 10, 16, false},
    {"6g", "LISS-L4", 10, 15, false},
    {"6h", "LISS-P3-L2", 10, 18, false},
    {"6i", "LISS-P3", 10, 17, false},
    {"6j", "LISS-W3-L2", 10, 20, false},
    {"6k", "LISS-W3", 10, 19, false},
    {"6l", "LISS-M3", 10, 23, false},
    {"6m", "LISS-AWF-L2", 10, 22, false},
    {"6n", "LISS-AWF", 10, 21, false},
    {"7", "EOC", 10, 24, false},
    {"8", "IRS", 10, 25, false},
    {"9", "MSS", 10, 186, false},
    {"10", "TM", 15.0, 31, false},
    {"10", "TM", 30.0, 30, false},
    {"11", "ETM", 30.0, 31, false},
    {"12", "IKO", 4.0, 33, false},
    {"12", "IKO", 1.0, 32, false},
    {"13", "ORBVIEW", 4.0, 35, false},
    {"13", "ORBVIEW", 1.0, 34, false},
    {"14a", "OV3_PAN_BASIC", 10, 36, false},
    {"14b", "OV3_PAN_GEO", 10, 37, false},
    {"14c", "OV3_MULTI_BASIC", 10, 38, false},
    {"14d", "OV3_MULTI_GEO", 10, 39, false},
    {"14e", "OV5_PAN_BASIC", 10, 40, false},
    {"14f", "OV5_PAN_GEO", 10, 41, false},
    {"14g", "OV5_MULTI_BASIC", 10, 42, false},
    {"14h", "OV5_MULTI_GEO", 10, 43, false},
    {"15", "QBIRD_PAN_STD", 10, 45, false},
    {"16", "QBIRD_PAN_STH", 10, 46, false},
    {"17", "QBIRD_PAN", 10, 44, false},
    {"18", "QBIRD_MULTI_STD", 10, 48, false},
    {"19", "QBIRD_MULTI_STH", 10, 49, false},
    {"20", "QBIRD_MULTI", 10, 47, false},
    {"21", "WVIEW1_PAN_STD", 10, 94, false},
    {"21", "WVIEW_PAN_STD", 10, 94, false},
    {"22", "WVIEW1_PAN", 10, 93, false},
    {"22", "WVIEW_PAN", 10, 93, false},
    {"23", "WVIEW_MULTI_STD", 10, 96, false},
    {"24", "WVIEW_MULTI", 10, 95, false},
    {"25a", "FORMOSAT_PAN_L2", 10, 52, false},
    {"25b", "FORMOSAT_MULTIL2", 10, 53, false},
    {"25c", "FORMOSAT_PAN", 10, 50, false},
    {"25d", "FORMOSAT_MULTI", 10, 51, false},
    {"26", "MERIS_FR", 10, 58, false},
    {"27", "MERIS_RR", 10, 59, false},
    {"28", "MERIS_LR", 10, 60, false},
    {"29", "ASAR", 10, 61, false},
    {"30", "EROS", 10, 62, false},
    {"31", "MODIS_1000", 10, 65, false},
    {"32", "MODIS_500", 10, 64, false},
    {"33", "MODIS_250", 10, 63, false},
    {"34a", "CBERS_HRC_L2", 10, 67, false},
    {"34b", "CBERS_HRC", 10, 66, false},
    {"34c", "CBERS_CCD_L2", 10, 69, false},
    {"34d", "CBERS_CCD", 10, 68, false},
    {"34e", "CBERS_IRM_80_L2", 10, 71, false},
    {"34f", "CBERS_IRM_80", 10, 70, false},
    {"34g", "CBERS_IRM_160_L2", 10, 73, false},
    {"34h", "CBERS_IRM_160", 10, 72, false},
    {"34i", "CBERS_WFI_L2", 10, 75, false},
    {"34j", "CBERS_WFI", 10, 74, false},
    {"34k", "CBERS4_PAN_1", 10, 178, false},
    {"34l", "CBERS4_MS_1", 10, 179, false},
    {"34m", "CBERS4_PAN_2", 10, 180, false},
    {"34n", "CBERS4_MS_2", 10, 181, false},
    {"34o", "CBERS4_THM_1", 10, 182, false},
    {"34p", "CBERS4_THM_2", 10, 183, false},
    {"35", "CARTOSAT1_L1", 10, 76, false},
    {"36", "CARTOSAT1_L2", 10, 77, false},
    {"37", "DMC_1R", 10, 83, false},
    {"38", "ALOS_PRISM_L1", 10, 78, false},
    {"39", "ALOS_PRISM_L2", 10, 79, false},
    {"40", "ALOS_AVNIR_L1", 10, 80, false},
    {"41", "ALOS_AVNIR_L2", 10, 81, false},
    {"42", "PALSAR", 10, 82, false},
    {"43a", "KOMPSAT2_PAN", 10, 84, false},
    {"43b", "KOMPSAT2_MULTI", 10, 85, false},
    {"43c", "KOMPSAT3_PAN", 10, 86, false},
    {"43d", "KOMPSAT3_PSH", 10, 88, false},
    {"43e", "KOMPSAT3_MS", 10, 87, false},
    {"43f", "KOMPSAT3A_PAN", 10, 89, false},
    {"43g", "KOMPSAT3A_PSH", 10, 91, false},
    {"43h", "KOMPSAT3A_MS", 10, 90, false},
    {"44", "TERRASAR", 10, 92, false},
    {"45", "RAPIDEYE", 10, 97, false},
    {"46", "RESOURCESAT", 10, 175, false},
    {"47", "THEOS_PAN_L1", 10, 98, false},
    {"48", "THEOS_PAN_L2", 10, 99, false},
    {"49", "THEOS_MS_L1", 10, 100, false},
    {"50", "THEOS_MS_L2", 10, 101, false},
    {"51a", "GOSAT_500_L1", 10, 102, false},
    {"51b", "GOSAT_500_L2", 10, 103, false},
    {"51c", "GOSAT_1500_L1", 10, 104, false},
    {"51d", "GOSAT_1500_L2", 10, 105, false},
    {"52a", "HJ_CCD_1A", 10, 106, false},
    {"52a", "HJ1A", 10, 106, false},
    {"52b", "HJ_CCD_1B", 10, 107, false},
    {"52b", "HJ1B", 10, 107, false},
    {"52c", "HJ1C", 10, 172, false},
    {"53", "RASAT_PAN", 10, 122, false},
    {"54", "RASAT_MS", 10, 123, false},
    {"55a", "SPOT5_PAN_2_5", 10, 54, false},
    {"55b", "SPOT5_PAN_5", 10, 55, false},
    {"55c", "SPOT5_HRS", 10, 56, false},
    {"55d", "SPOT5_MULTI", 10, 57, false},
    {"55e", "SPOT6_PAN", 10, 116, false},
    {"55f", "SPOT6_MS", 10, 117, false},
    {"55g", "SPOT6_PSH", 10, 118, false},
    {"55h", "SPOT7_PAN", 10, 119, false},
    {"55i", "SPOT7_MS", 10, 120, false},
    {"55j", "SPOT7_PSH", 10, 121, false},
    {"56a", "PLEIADES_PAN_L1", 10, 108, false},
    {"56b", "PLEIADES_MS_L1", 10, 109, false},
    {"56c", "PLEIADES_PAN_L2", 10, 110, false},
    {"56d", "PLEIADES_MS_L2", 10, 111, false},
    {"57a", "SSOT_PAN_L1", 10, 112, false},
    {"57b", "SSOT_MS_L1", 10, 113, false},
    {"57c", "SSOT_PAN_L2", 10, 114, false},
    {"57d", "SSOT_MS_L2", 10, 115, false},
    {"58", "TH01_DGP", 10, 124, false},
    {"59", "TH01_GFB", 10, 125, false},
    {"60", "TH01_SXZ", 10, 126, false},
    {"61a", "ZY3_NAD", 10, 130, false},
    {"61b", "ZY3_FWD", 10, 131, false},
    {"61c", "ZY3_BWD", 10, 132, false},
    {"61d", "ZY3_MUX", 10, 133, false},
    {"61e", "ZY3_TLC", 10, 134, false},
    {"61f", "ZY1_02C_HRC", 10, 127, false},
    {"61g", "ZY1_02C_PMS_PAN", 10, 128, false},
    {"61h", "ZY1_02C_PMS_MS", 10, 129, false},
    {"62", "GK2_PAN", 10, 135, false},
    {"63", "GK2_MS", 10, 136, false},
    {"64", "MRC_RED", 10, 138, false},
    {"65", "MRC_BLU", 10, 140, false},
    {"66", "MRC_GRN", 10, 139, false},
    {"67", "MRC_NIR", 10, 141, false},
    {"68a", "GF1_PMS_PAN", 10, 142, false},
    {"68b", "GF2_PMS_PAN", 10, 145, false},
    {"68c", "GF1_PMS_MS", 10, 143, false},
    {"68d", "GF2_PMS_MS", 10, 146, false},
    {"68e", "GF1_WFV", 10, 144, false},
    {"69", "HRC", 10, 137, false},
    {"70", "SJ9_PAN", 10, 147, false},
    {"71", "SJ9_MUX", 10, 148, false},
    {"72", "SJ9_PMS_PAN", 10, 149, false},
    {"73", "SJ9_PMS_MS", 10, 150, false},
    {"74", "YG2_1", 10, 151, false},
    {"75", "YG8_1", 10, 152, false},
    {"76", "YG14_1", 10, 153, false},
    {"77", "UAVSAR", 10, 154, false},
    {"78a", "ALSAT2_PAN_1A", 10, 157, false},
    {"78b", "ALSAT2_MS_1A", 10, 158, false},
    {"78c", "ALSAT2_PAN_2A", 10, 159, false},
    {"78d", "ALSAT2_MS_2A", 10, 160, false},
    {"79a", "DUBAISAT2_PAN", 10, 161, false},
    {"79b", "DUBAISAT2_MS", 10, 162, false},
    {"80a", "KAZEOSAT1_PAN_1A", 10, 163, false},
    {"80b", "KAZEOSAT1_MS_1A", 10, 164, false},
    {"80c", "KAZEOSAT1_PAN_2A", 10, 165, false},
    {"80d", "KAZEOSAT1_MS_2A", 10, 166, false},
    {"80e", "KAZEOSAT2_MS_1G", 10, 167, false},
    {"81a", "DEIMOS1_MS_1R", 10, 168, true},
    {"81b", "DEIMOS2_PAN_1B", 10, 169, false},
    {"81c", "DEIMOS2_MS_1B", 10, 170, true},
    {"81d", "DEIMOS2_PSH_1B", 10, 171, false},
    {"82a", "TRIPLESAT_PAN", 10, 173, false},
    {"82b", "TRIPLESAT_MS", 10, 174, false},
    {"83a", "JL101A_PAN", 10, 176, false},
    {"83b", "JL101A_MS", 10, 177, false},
    {"84", "HI_RES", 10, 155, false},
    {"85", "MED_RES", 10, 156, false},
    {"86", "NEW", 10, 184, false},
    {"87", "UNKNOWN_SENSOR", 10, -999, false},
};

std::string Lowered(std::string os) {
    for (char& c : os) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return os;
}

class CatalogueRow : public ::testing::TestWithParam<CatalogueCase> {};

// The exact name, the name in lower case, and (when it fits) the name with a
// further character: a prefix row still matches it, a whole-name row does not.
TEST_P(CatalogueRow, NameYieldsItsCode) {
    const CatalogueCase& c = GetParam();
    EXPECT_EQ(SensorOf(c.pszName, c.dfPixelRes), c.nExpected);
    EXPECT_EQ(SensorOf(Lowered(c.pszName), c.dfPixelRes), c.nExpected);
    if (std::strlen(c.pszName) < 16) {
        const int nExtended = SensorOf(std::string(c.pszName) + "Q", c.dfPixelRes);
        EXPECT_EQ(nExtended, c.bWholeName ? -999 : c.nExpected);
    }
}

INSTANTIATE_TEST_SUITE_P(EveryRow, CatalogueRow, ::testing::ValuesIn(kCatalogue));

TEST(SensorCatalogue, MatchingRules) {
    EXPECT_EQ(SensorOf("spot5_pan_5"), 55);
    EXPECT_EQ(SensorOf("SpOt5_PaN_5"), 55);
    EXPECT_EQ(SensorOf("SPOT5_PAN_2_5"), 54);
    // The group matched and none of its members did: no later row is tried.
    EXPECT_EQ(SensorOf("SPOT5"), -999);
    EXPECT_EQ(SensorOf("SPOT"), -999);
    EXPECT_EQ(SensorOf("LISS-9"), -999);
    EXPECT_EQ(SensorOf("GF3_SAR"), -999);
    // A name shorter than a row's text does not match it.
    EXPECT_EQ(SensorOf("QBIRD_PA"), -999);
    EXPECT_EQ(SensorOf("AVHR"), -999);
    EXPECT_EQ(SensorOf(""), -999);
    EXPECT_EQ(SensorOf("TM"), 30);
    EXPECT_EQ(SensorOf("ETM+"), 31);
    EXPECT_EQ(SensorOf("ETM_PAN", 15.0), 31);
    EXPECT_EQ(SensorOf("RADARSAT_2"), 9);
    EXPECT_EQ(SensorOf("RADARSAT_2", 6.25), 26);
    EXPECT_EQ(SensorOf("RADARSAT_2X"), -999);
    EXPECT_EQ(SensorOf("radarsat_2"), 9);
    EXPECT_EQ(SensorOf("SAR_ANYTHING", 6.25), 26);
    EXPECT_EQ(SensorOf("DEIMOS2_MS_1B"), 170);
    EXPECT_EQ(SensorOf("DEIMOS2_MS_1BX"), -999);
    EXPECT_EQ(SensorOf("DEIMOS2_PAN_1BX"), 169);
    EXPECT_EQ(SensorOf("HJ1A"), 106);
    EXPECT_EQ(SensorOf("HJ_CCD_1A"), 106);
    EXPECT_EQ(SensorOf("OV9_PAN"), -999);
    EXPECT_EQ(SensorOf("ORBVIEW3"), 34);
    EXPECT_EQ(SensorOf("ORBVIEW3", 4.0), 35);
    // Within a group the member order holds even where a shorter text leads.
    EXPECT_EQ(SensorOf("GF1_PMS_PAN"), 142);
    // Only ASCII letters fold; other characters compare as they are.
    EXPECT_EQ(SensorOf("LISS_1"), -999);
}

TEST(SensorCatalogue, PixelSizeIsComparedExactly) {
    const double dfNaN = std::numeric_limits<double>::quiet_NaN();
    EXPECT_EQ(SensorOf("TM", dfNaN), 30);
    EXPECT_EQ(SensorOf("SAR", dfNaN), 9);
    EXPECT_EQ(SensorOf("IKO", std::nextafter(4.0, 5.0)), 32);
    EXPECT_EQ(SensorOf("TM", 15.000000001), 30);
}

TEST(SensorCatalogue, NameFillingItsWholeFieldAndNullSegment) {
    EphemerisSeg_t sSeg{};
    // 17 characters and no terminator: only the field itself is read.
    std::memcpy(sSeg.szSensorName, "DEIMOS2_MS_1BABCD", sizeof(sSeg.szSensorName));
    sSeg.szSensorExtra[0] = 'Z';
    EXPECT_EQ(GetSensor(&sSeg), -999);
    std::memcpy(sSeg.szSensorName, "SPOT5_PAN_5ABCDEF", sizeof(sSeg.szSensorName));
    EXPECT_EQ(GetSensor(&sSeg), 55);
    EXPECT_EQ(GetSensor(nullptr), -999);
}

// Model classes transcribed as text, expanded independently of the library's
// table.
std::map<int, int> ExpectedClasses() {
    const std::vector<std::pair<int, const char*>> aRows = {
        {0, "0-7, 184"},
        {1,
         "8, 10-13, 15, 17, 19, 21, 23-25, 55-57, 63-65, 68, 70, 72, 74, 80, 81, 102, 104, 122, "
         "123, 136, 144, 152, 156, 178, 179, 182"},
        {2,
         "14, 16, 18, 20, 22, 30, 31, 67, 69, 71, 73, 75, 79, 83, 103, 105, 110, 111, 114, 115, "
         "159, 160, 167, 175, 180, 181, 183, 186"},
        {3, "9, 26-29, 32, 33, 37, 39, 41, 43, 45, 48, 52, 53, 61, 77, 82, 92, 94, 96, 172"},
        {4,
         "34-36, 38, 40, 42, 44, 47, 54, 66, 76, 78, 84-91, 93, 95, 97, 108, 109, 112, 113, "
         "116-121, 124-135, 138-143, 145-151, 153, 155, 157, 158, 161-164, 168-171, 173, 174, "
         "176, 177"},
        {5, "46, 49, 50, 51, 62, 137"},
        {6, "58-60, 98-101, 106, 107, 165, 166"},
        {-999, "154, 185"},
    };
    std::map<int, int> oClasses;
    for (const auto& oRow : aRows) {
        std::stringstream oIn(oRow.second);
        std::string osItem;
        while (std::getline(oIn, osItem, ',')) {
            const std::size_t nDash = osItem.find('-');
            const int nFirst = std::stoi(osItem.substr(0, nDash));
            const int nLast =
                nDash == std::string::npos ? nFirst : std::stoi(osItem.substr(nDash + 1));
            for (int n = nFirst; n <= nLast; ++n) {
                EXPECT_EQ(oClasses.count(n), 0u) << "code " << n << " listed twice";
                oClasses[n] = oRow.first;
            }
        }
    }
    return oClasses;
}

TEST(SensorCatalogue, ModelClassOfEveryCode) {
    const std::map<int, int> oClasses = ExpectedClasses();
    for (int n = 0; n <= 186; ++n) {
        const auto it = oClasses.find(n);
        const int nExpected = it == oClasses.end() ? -999 : it->second;
        EXPECT_EQ(GetModel(n), nExpected) << "sensor code " << n;
    }
    EXPECT_EQ(GetModel(185), -999);
    EXPECT_EQ(GetModel(-1), -999);
    EXPECT_EQ(GetModel(187), -999);
    EXPECT_EQ(GetModel(-999), -999);
    EXPECT_EQ(GetModel(186), 2);
    EXPECT_EQ(GetModel(0), 0);
}

// Every code the catalogue produces, other than the two without a rigorous
// model, has a model class.
TEST(SensorCatalogue, ProducedCodesHaveAClass) {
    for (const CatalogueCase& c : kCatalogue) {
        if (c.nExpected == -999 || c.nExpected == 154 || c.nExpected == 185) continue;
        EXPECT_GE(GetModel(c.nExpected), 0) << c.pszName;
    }
}

TEST(SensorCatalogue, GetModelWritesADebugMessageWhenLevelIsSet) {
    std::vector<nova::diag::DebugRecord> asRecords;
    auto oOldSink = nova::diag::Debugger::SetSink(
        [&](const nova::diag::DebugRecord& r) { asRecords.push_back(r); });
    const int nOldLevel = nova::diag::Debugger::moDebugLevel;
    nova::diag::Debugger::SetDebugLevel(0);
    GetModel(55);
    EXPECT_TRUE(asRecords.empty());
    nova::diag::Debugger::SetDebugLevel(1);
    EXPECT_EQ(GetModel(55), 1);
    nova::diag::Debugger::SetDebugLevel(nOldLevel);
    nova::diag::Debugger::SetSink(oOldSink);
    ASSERT_EQ(asRecords.size(), 1u);
    EXPECT_EQ(asRecords[0].osMessage, "Get Model nSensor=55\n");
    EXPECT_EQ(asRecords[0].nLevel, 1);
    EXPECT_EQ(asRecords[0].osModule, "lumokit");
    EXPECT_EQ(asRecords[0].osFile, "mathmodel/lumo/calcfunc");
}

}  // namespace
