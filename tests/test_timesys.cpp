// Host time systems: calendar, Julian dates and leap seconds on ERFA.
#include <gtest/gtest.h>

#include <array>
#include <cmath>

#include "timesys.h"

namespace {

using nova::tsys::Timestamp;
using nova::tsys::TimeSystemConverter;

TEST(TimeSystems, CalendarDatesAndDaysOfTheYear) {
    const TimeSystemConverter oConv;
    int nDoy = -1;
    EXPECT_EQ(oConv.CalendarToDoy(2000, 12, 31, nDoy), 0);
    EXPECT_EQ(nDoy, 366);  // a leap year ending
    EXPECT_EQ(oConv.CalendarToDoy(2001, 3, 1, nDoy), 0);
    EXPECT_EQ(nDoy, 60);
    // Invalid dates fail and give day 0.
    for (const auto& d : {std::array<int, 3>{2001, 2, 29}, {2004, 13, 1}, {2004, 4, 31}}) {
        EXPECT_NE(oConv.CalendarToDoy(d[0], d[1], d[2], nDoy), 0);
        EXPECT_EQ(nDoy, 0);
    }
    Timestamp oJd;
    ASSERT_EQ(oConv.CalendarToJulian(2000, 1, 1, 12, 0, 0.0, oJd), 0);
    EXPECT_EQ(oJd.ToDouble(), 2451545.0);  // J2000.0
    Timestamp oMjd;
    ASSERT_EQ(oConv.JulianToMjd(oJd, oMjd), 0);
    EXPECT_EQ(oMjd.ToDouble(), 51544.5);
    EXPECT_NE(oConv.CalendarToJulian(2000, 1, 1, 24, 0, 0.0, oJd), 0);
    EXPECT_NE(oConv.CalendarToJulian(2000, 1, 1, 0, 0, NAN, oJd), 0);
    int y = 0, m = 0, d = 0;
    double f = 0.0;
    ASSERT_EQ(oConv.JulianToCalendar(oJd, y, m, d, f), 0);
    EXPECT_EQ(y * 10000 + m * 100 + d, 20000101);
    EXPECT_EQ(f, 0.5);
}

TEST(TimeSystems, TimestampKeepsSubMicrosecondSteps) {
    const TimeSystemConverter oConv;
    Timestamp oJd;
    ASSERT_EQ(oConv.CalendarToJulian(2024, 2, 29, 23, 59, 59.0, oJd), 0);
    // A million steps of a microsecond add up to a second within a microsecond.
    for (int k = 0; k < 1000000; ++k) oJd += 1e-6 / 86400.0;
    int y = 0, m = 0, d = 0;
    double f = 0.0;
    ASSERT_EQ(oConv.JulianToCalendar(oJd, y, m, d, f), 0);
    EXPECT_EQ(y * 10000 + m * 100 + d, 20240301);
    EXPECT_NEAR(f * 86400.0, 0.0, 1e-6);
    oJd += -1.5;  // back across the day boundary
    EXPECT_GE(oJd.GetFraction(), 0.0);
    EXPECT_LT(oJd.GetFraction(), 1.0);
}

TEST(TimeSystems, LeapSecondsAndTerrestrialTime) {
    const TimeSystemConverter oConv;
    Timestamp oUtc, oTt;
    double dfLeap = 0.0;
    ASSERT_EQ(oConv.CalendarToJulian(1999, 1, 1, 0, 0, 0.0, oUtc), 0);
    ASSERT_EQ(oConv.TaiMinusUtc(oUtc, dfLeap), 0);
    EXPECT_EQ(dfLeap, 32.0);
    ASSERT_EQ(oConv.CalendarToJulian(2020, 6, 1, 0, 0, 0.0, oUtc), 0);
    ASSERT_EQ(oConv.UtcToTt(oUtc, oTt), 0);
    const double dfDays = (oTt.GetDay() - oUtc.GetDay()) + (oTt.GetFraction() - oUtc.GetFraction());
    EXPECT_NEAR(dfDays * 86400.0, 69.184, 1e-6);
    // Far beyond the table the value is kept but flagged as uncertain.
    ASSERT_EQ(oConv.CalendarToJulian(2150, 1, 1, 0, 0, 0.0, oUtc), 0);
    EXPECT_EQ(oConv.TaiMinusUtc(oUtc, dfLeap), 1);
}

}  // namespace
