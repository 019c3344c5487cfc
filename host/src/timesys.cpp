// Time systems on ERFA: calendar conversions, Julian dates, leap seconds.

#include "timesys.h"

#include <cmath>

#include <erfa.h>

namespace nova {
namespace tsys {
namespace {

constexpr double kSecondsPerDay = 86400.0;

// A time of day ERFA would accept: whole hours and minutes, seconds that may
// reach into a leap second.
bool ValidTimeOfDay(int hour, int minute, double second) {
    return hour >= 0 && hour <= 23 && minute >= 0 && minute <= 59 && std::isfinite(second) &&
           second >= 0.0 && second < 61.0;
}

bool Finite(const Timestamp& t) {
    return std::isfinite(t.GetDay()) && std::isfinite(t.GetFraction());
}

}  // namespace

Timestamp::Timestamp(double dfDays, double dfFraction) : mdfDay(dfDays), mdfFraction(dfFraction) {
    Normalize();
}

Timestamp& Timestamp::operator+=(double dfDays) {
    // The whole days go to the day part, so the fraction keeps its resolution.
    const double dfWhole = std::floor(dfDays);
    mdfDay += dfWhole;
    mdfFraction += dfDays - dfWhole;
    Normalize();
    return *this;
}

void Timestamp::Normalize() {
    if (!std::isfinite(mdfDay) || !std::isfinite(mdfFraction)) return;
    const double dfWholeDay = std::floor(mdfDay);
    mdfFraction += mdfDay - dfWholeDay;  // exact: both lie within one binade
    mdfDay = dfWholeDay;
    const double dfCarry = std::floor(mdfFraction);
    mdfDay += dfCarry;
    mdfFraction -= dfCarry;
}

int TimeSystemConverter::CalendarToDoy(int year, int month, int day, int& dayOfYear) const {
    dayOfYear = 0;
    double dfZero = 0.0, dfMjd = 0.0, dfMjdJan1 = 0.0;
    if (eraCal2jd(year, month, day, &dfZero, &dfMjd) != 0) return -1;
    if (eraCal2jd(year, 1, 1, &dfZero, &dfMjdJan1) != 0) return -1;
    dayOfYear = static_cast<int>(dfMjd - dfMjdJan1) + 1;
    return 0;
}

int TimeSystemConverter::CalendarToJulian(int year, int month, int day, int hour, int minute,
                                          double second, Timestamp& julian) const {
    double dfZero = 0.0, dfMjd = 0.0;
    if (!ValidTimeOfDay(hour, minute, second)) return -2;
    if (eraCal2jd(year, month, day, &dfZero, &dfMjd) != 0) return -1;
    // ERA_DJM0 + MJD is the Julian date of 0 h: an exact half-day number.
    julian = Timestamp(dfZero + dfMjd, ((hour * 60.0 + minute) * 60.0 + second) / kSecondsPerDay);
    return 0;
}

int TimeSystemConverter::JulianToCalendar(const Timestamp& julian, int& year, int& month, int& day,
                                          double& dayFraction) const {
    if (!Finite(julian)) return -1;
    return eraJd2cal(julian.GetDay(), julian.GetFraction(), &year, &month, &day, &dayFraction) == 0
               ? 0
               : -1;
}

int TimeSystemConverter::JulianToMjd(const Timestamp& julian, Timestamp& mjd) const {
    if (!Finite(julian)) return -1;
    // The whole-day part stays whole: the half day moves into the fraction.
    mjd = Timestamp(julian.GetDay() - 2400001.0, julian.GetFraction() + 0.5);
    return 0;
}

int TimeSystemConverter::MjdToJulian(const Timestamp& mjd, Timestamp& julian) const {
    if (!Finite(mjd)) return -1;
    julian = Timestamp(mjd.GetDay() + 2400000.0, mjd.GetFraction() + 0.5);
    return 0;
}

int TimeSystemConverter::TaiMinusUtc(const Timestamp& utc, double& seconds) const {
    int year = 0, month = 0, day = 0;
    double dfFraction = 0.0;
    if (JulianToCalendar(utc, year, month, day, dfFraction) != 0) return -1;
    const int status = eraDat(year, month, day, dfFraction, &seconds);
    return status < 0 ? -1 : status;
}

int TimeSystemConverter::UtcToTai(const Timestamp& utc, Timestamp& tai) const {
    if (!Finite(utc)) return -1;
    double dfTai1 = 0.0, dfTai2 = 0.0;
    const int status = eraUtctai(utc.GetDay(), utc.GetFraction(), &dfTai1, &dfTai2);
    if (status < 0) return -1;
    tai = Timestamp(dfTai1, dfTai2);
    return status;
}

int TimeSystemConverter::UtcToTt(const Timestamp& utc, Timestamp& tt) const {
    Timestamp tai;
    const int status = UtcToTai(utc, tai);
    if (status < 0) return status;
    double dfTt1 = 0.0, dfTt2 = 0.0;
    eraTaitt(tai.GetDay(), tai.GetFraction(), &dfTt1, &dfTt2);
    tt = Timestamp(dfTt1, dfTt2);
    return status;
}

}  // namespace tsys
}  // namespace nova
