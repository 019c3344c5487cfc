// Sensor catalogue: the matching rules (case, prefixes, groups, whole names,
// pixel sizes, unterminated names) and the model classes.
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <limits>
#include <string>
#include <vector>

#include "lumo.h"
#include "runtime.h"
#include "support/warnings.h"

namespace {

int SensorOf(const std::string& osName, double dfPixelRes = 10.0) {
    EphemerisSeg_t sSeg{};
    std::strncpy(sSeg.szSensorName, osName.c_str(), sizeof(sSeg.szSensorName) - 1);
    sSeg.dfPixelRes = dfPixelRes;
    return GetSensor(&sSeg);
}

TEST(SensorCatalogue, MatchingRules) {
    const struct {
        const char* pszName;
        double dfPixelRes;
        int nCode;
    } aCases[] = {
        // One case per matching rule; the catalogue's rows are its data.
        {"spot5_pan_5", 10, 55},    // case does not matter
        {"SpOt5_PaN_5X", 10, 55},   // a row's text is a prefix of the name
        {"SPOT5_PAN_2_5", 10, 54},  // longer text first within the group
        {"SPOT5", 10, -999},        // the group matched, none of its rows did
        {"QBIRD_PA", 10, -999},     // shorter than the row's text
        {"", 10, -999},
        {"TM", 30.0, 30},  // pixel size decides between rows of one name
        {"TM", 15.0, 31},
        {"TM", 15.000000001, 30},
        {"TM", 14.999999999, 30},
        {"IKO", 4.0, 33},
        {"IKO", std::nextafter(4.0, 5.0), 32},
        {"RADARSAT_2X", 10, -999},
        {"HJ_CCD_1A", 10, 106},  // a second name of the same sensor
    };
    for (const auto& c : aCases) {
        EXPECT_EQ(SensorOf(c.pszName, c.dfPixelRes), c.nCode) << c.pszName << " @" << c.dfPixelRes;
    }
    // A pixel size that is not a number equals nothing.
    EXPECT_EQ(SensorOf("TM", std::numeric_limits<double>::quiet_NaN()), 30);
    // 17 characters and no terminator: only the field itself is read.
    EphemerisSeg_t sSeg{};
    std::memcpy(sSeg.szSensorName, "DEIMOS2_MS_1BABCD", sizeof(sSeg.szSensorName));
    sSeg.szSensorExtra[0] = 'Z';
    EXPECT_EQ(GetSensor(&sSeg), -999);
    std::memcpy(sSeg.szSensorName, "SPOT5_PAN_5ABCDEF", sizeof(sSeg.szSensorName));
    EXPECT_EQ(GetSensor(&sSeg), 55);
    EXPECT_EQ(GetSensor(nullptr), -999);
}

TEST(SensorCatalogue, ModelClasses) {
    for (int n = -1000; n <= 400; ++n) {
        const int nClass = GetModel(n);
        EXPECT_TRUE(nClass == -999 || (nClass >= 0 && nClass <= 6)) << n;
        if (n < 0 || n > 186) {
            EXPECT_EQ(nClass, -999) << n;
        }
    }
    const int anCodes[] = {0,  7,  184, 8,  55,  186, 14,  30,  9,
                           32, 54, 44,  50, 137, 58,  166, 154, 185};
    const int anClasses[] = {0, 0, 0, 1, 1, 2, 2, 2, 3, 3, 4, 4, 5, 5, 6, 6, -999, -999};
    for (std::size_t i = 0; i < sizeof anCodes / sizeof anCodes[0]; ++i) {
        EXPECT_EQ(GetModel(anCodes[i]), anClasses[i]) << anCodes[i];
    }
}

TEST(SensorCatalogue, GetModelWritesADebugMessageWhenLevelIsSet) {
    lumo::support::DebugCapture oOff(0);
    GetModel(55);
    EXPECT_TRUE(oOff.maoRecords.empty());
    lumo::support::DebugCapture oOn(1);
    EXPECT_EQ(GetModel(55), 1);
    ASSERT_EQ(oOn.maoRecords.size(), 1u);
    EXPECT_EQ(oOn.maoRecords[0].osMessage, "Get Model nSensor=55\n");
    EXPECT_EQ(oOn.maoRecords[0].osFile, "mathmodel/lumo/calcfunc");
}

}  // namespace
