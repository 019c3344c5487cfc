// Time systems of the host, built on ERFA: calendar dates, day of the year,
// Julian and modified Julian dates, and the UTC, TAI and TT time scales with
// their leap-second table.
//
// A Timestamp holds a Julian date in two parts (a whole-day part and a
// fraction) so that adding seconds to a date keeps a resolution far below a
// microsecond; ToDouble() gives the date as one double (about 40 microseconds
// resolution for present-day Julian dates, a few nanoseconds for modified
// Julian dates).
//
// The calendar is the proleptic Gregorian one. Every conversion returns 0 on
// success and a negative number for input it cannot convert (a month outside
// 1..12, a day the month does not have, a time of day out of range, a
// non-finite number); the outputs are then set as each function states.
#pragma once

namespace nova {
namespace tsys {

class Timestamp {
  public:
    Timestamp() = default;
    // The date dfDays + dfFraction, in days; the split is free.
    explicit Timestamp(double dfDays, double dfFraction = 0.0);

    // Moves the date by a number of days (which may be fractional or negative).
    Timestamp& operator+=(double dfDays);

    // The date as one number of days.
    double ToDouble() const { return mdfDay + mdfFraction; }
    // The two parts: a whole number of days and a fraction in [0, 1).
    double GetDay() const { return mdfDay; }
    double GetFraction() const { return mdfFraction; }

  private:
    void Normalize();

    double mdfDay = 0.0;
    double mdfFraction = 0.0;
};

// Difference between modified and ordinary Julian dates.
constexpr double kMjdOffset = 2400000.5;

class TimeSystemConverter {
  public:
    // The leap-second table is ERFA's own (TAI - UTC since 1960); it is part of
    // the library, so the converter needs nothing at run time.
    TimeSystemConverter() = default;
    ~TimeSystemConverter() = default;

    // Day of the year, 1 to 366. On failure dayOfYear is 0.
    int CalendarToDoy(int year, int month, int day, int& dayOfYear) const;

    // Julian date of a calendar date and time of day (second may carry a
    // fraction and may reach 60.999... inside a leap second). On failure the
    // timestamp is left unchanged.
    int CalendarToJulian(int year, int month, int day, int hour, int minute, double second,
                         Timestamp& julian) const;

    // Calendar date and fraction of the day (in [0, 1)) of a Julian date.
    int JulianToCalendar(const Timestamp& julian, int& year, int& month, int& day,
                         double& dayFraction) const;

    // Modified Julian date (JD - 2400000.5) of a Julian date and back.
    int JulianToMjd(const Timestamp& julian, Timestamp& mjd) const;
    int MjdToJulian(const Timestamp& mjd, Timestamp& julian) const;

    // TAI - UTC in seconds at a UTC Julian date (the leap seconds, with the
    // drifting offsets of 1960 to 1971). Returns 1 instead of 0 when the date
    // lies beyond the table's reliable range (before 1960, or years after its
    // last entry, where a leap second may since have been announced): the
    // value is then the table's last one.
    int TaiMinusUtc(const Timestamp& utc, double& seconds) const;

    // UTC to TAI and to Terrestrial Time (TT = TAI + 32.184 s), Julian dates.
    // Return as TaiMinusUtc.
    int UtcToTai(const Timestamp& utc, Timestamp& tai) const;
    int UtcToTt(const Timestamp& utc, Timestamp& tt) const;
};

}  // namespace tsys
}  // namespace nova
