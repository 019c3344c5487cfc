// Reading the orbit model's set-up from an ephemeris segment: the AVHRR
// orbit header (epoch, clock offset, Greenwich angle, mean elements as
// fixed-width text), the scan-line time codes, and their checks.
//
// Header fields must hold a number in the width the header gives them
// (blanks around it allowed); anything else is an error naming the field,
// since a misread epoch or element would silently misplace the whole image.
#include <cctype>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <string>

#include "errors.h"
#include "lrs_internal.h"
#include "runtime.h"
#include "segment_access.h"
#include "timesys.h"

namespace lumo::lrs {
namespace {

constexpr int kFieldWidth = AVHRR_FIELD_SIZE - 1;
constexpr int kElementWidth = 8;
constexpr int kGreenwichWidth = 7;
constexpr int kFirstYear = 1900;
constexpr int kLastYear = 2199;
// Scan lines further than this from the element epoch, or a pass longer
// than this, cannot be modelled from one element set.
constexpr double kMaxDaysFromEpoch = 366.0;
constexpr double kMaxPassSeconds = kSecondsPerDay;

// The first `width` characters of a field, up to its terminator.
std::string FieldText(const char* pszField, int nWidth) {
    std::string osText;
    for (int k = 0; k < nWidth && pszField[k] != '\0'; ++k) osText += pszField[k];
    return osText;
}

// The text as it may appear in a message: unprintable bytes as '?'.
std::string Printable(const std::string& osText) {
    std::string osOut;
    for (char ch : osText) {
        osOut += std::isprint(static_cast<unsigned char>(ch)) ? ch : '?';
    }
    return osOut;
}

std::string Trimmed(const std::string& osText) {
    const std::size_t nFirst = osText.find_first_not_of(" \t");
    if (nFirst == std::string::npos) return std::string();
    const std::size_t nLast = osText.find_last_not_of(" \t");
    return osText.substr(nFirst, nLast - nFirst + 1);
}

[[noreturn]] void BadField(const char* pszName, const std::string& osText, const char* pszWhy) {
    Fatal(Err::kBadArgument, MkName(_("AVHRR orbit header field %s (\"%s\") %s.\n"), pszName,
                                    Printable(osText).c_str(), pszWhy));
}

// A number in the first nWidth characters of a header field; bInteger
// accepts digits with an optional sign only.
double ParseField(const char* pszField, int nWidth, const char* pszName, bool bInteger) {
    const std::string osRaw = FieldText(pszField, nWidth);
    std::string osText = Trimmed(osRaw);
    if (osText.empty()) BadField(pszName, osRaw, "is empty");
    for (char& ch : osText) {
        const bool bSign = ch == '+' || ch == '-';
        const bool bDigit = std::isdigit(static_cast<unsigned char>(ch)) != 0;
        const bool bReal = ch == '.' || ch == 'e' || ch == 'E' || ch == 'd' || ch == 'D';
        if (!bDigit && !bSign && (bInteger || !bReal)) BadField(pszName, osRaw, "is not a number");
        if (ch == 'd' || ch == 'D') ch = 'E';  // Fortran exponent
    }
    char* pszEnd = nullptr;
    const double dfValue = std::strtod(osText.c_str(), &pszEnd);
    if (pszEnd != osText.c_str() + osText.size() || !std::isfinite(dfValue)) {
        BadField(pszName, osRaw, "is not a number");
    }
    return dfValue;
}

int ParseIntField(const char* pszField, int nWidth, const char* pszName, int nMin, int nMax) {
    const double dfValue = ParseField(pszField, nWidth, pszName, true);
    if (dfValue < nMin || dfValue > nMax) {
        BadField(pszName, FieldText(pszField, nWidth),
                 MkName(_("lies outside %d..%d"), nMin, nMax));
    }
    return static_cast<int>(dfValue);
}

bool IsAvhrr(const EphemerisSeg_t& sSeg) {
    return SensorNameStartsWith(sSeg, "AVHRR");
}

const AvhrrData_t& RequireAvhrr(const EphemerisSeg_t& sSeg) {
    if (sSeg.nOrbitType != EPH_ORBIT_AVHRR || sSeg.ppOrbitData == nullptr ||
        *sSeg.ppOrbitData == nullptr) {
        Fatal(Err::kBadArgument,
              MkName(_("AVHRR segment: nOrbitType is %d with %s; the orbit model needs the AVHRR "
                       "orbit header (nOrbitType 3 with its sub-record).\n"),
                     static_cast<int>(sSeg.nOrbitType),
                     sSeg.ppOrbitData == nullptr ? "no sub-record" : "an empty holder"));
    }
    const auto& sAvhrr = *static_cast<const AvhrrData_t*>(*sSeg.ppOrbitData);
    if (sAvhrr.pScanLines == nullptr || sAvhrr.nNumScanLines < 2) {
        Fatal(Err::kBadArgument,
              MkName(_("AVHRR segment: nNumScanLines is %d%s; the orbit model needs at least 2 "
                       "scan lines with their time codes.\n"),
                     static_cast<int>(sAvhrr.nNumScanLines),
                     sAvhrr.pScanLines == nullptr ? " without a line array" : ""));
    }
    return sAvhrr;
}

// Seconds of the year of a scan line's time code, plus the clock offset;
// nDay receives the code's day of the year. Codes that are all zero (no
// code) are returned as they are, for the caller's checks to reject.
double CodeSeconds(const AvhrrLine_t& sLine, int nLine, double dfClock, int& nDay) {
    const uint8_t* c = sLine.abyTimeCode;
    static const int anMax[AVHRR_TIME_CODE_SIZE] = {255, 99, 23, 59, 60, 99, 99};
    static const char* const apszPart[AVHRR_TIME_CODE_SIZE] = {
        "day hundreds", "day", "hour", "minute", "second", "hundredths", "ten-thousandths"};
    for (int k = 0; k < AVHRR_TIME_CODE_SIZE; ++k) {
        if (c[k] > anMax[k]) {
            Fatal(Err::kBadArgument,
                  MkName(_("AVHRR segment: pScanLines[%d].abyTimeCode[%d] (%s) is %d, above %d.\n"),
                         nLine, k, apszPart[k], c[k], anMax[k]));
        }
    }
    nDay = 100 * c[0] + c[1];
    return (((nDay - 1) * 24.0 + c[2]) * 60.0 + c[3]) * 60.0 + c[4] + c[5] * 0.01 + c[6] * 0.0001 +
           dfClock;
}

int DaysInYear(int nYear) {
    const bool bLeap = (nYear % 4 == 0 && nYear % 100 != 0) || nYear % 400 == 0;
    return bLeap ? 366 : 365;
}

// Time codes carry no year. Seconds u of the code's own year are placed in
// the epoch year's count, taking the code in the previous, the same or the
// next year, whichever puts it nearest the epoch: a pass across New Year
// (day 366 to day 1) stays continuous.
double PlaceInEpochYear(double dfSeconds, int nYear, double dfEpochSec) {
    const double adfCandidates[3] = {dfSeconds - DaysInYear(nYear - 1) * kSecondsPerDay, dfSeconds,
                                     dfSeconds + DaysInYear(nYear) * kSecondsPerDay};
    double dfBest = dfSeconds;
    for (double dfCandidate : adfCandidates) {
        if (std::fabs(dfCandidate - dfEpochSec) < std::fabs(dfBest - dfEpochSec)) {
            dfBest = dfCandidate;
        }
    }
    return dfBest;
}

// Acquisition date of the segment: its day of the year (0 when the text
// gives no valid date) and the same day counted from 1 January of nYear.
struct AcquisitionDay {
    int nDayOfYear = 0;
    int nDayInEpochYear = 0;
};

AcquisitionDay ReadAcquisitionDay(const EphemerisSeg_t& sSeg, int nEpochYear) {
    const char* d = sSeg.szAcquisitionDate;
    const int nYear = ScanInt(d, 4);
    const int nMonth = ScanInt(d + 5, 2);
    const int nDay = ScanInt(d + 8, 2);
    const nova::tsys::TimeSystemConverter oConverter;
    AcquisitionDay sDay;
    if (strnlen(d, EPH_DATE_SIZE) < 10 ||
        oConverter.CalendarToDoy(nYear, nMonth, nDay, sDay.nDayOfYear) != 0) {
        sDay.nDayOfYear = 0;
        return sDay;
    }
    nova::tsys::Timestamp oDate, oJan1;
    oConverter.CalendarToJulian(nYear, nMonth, nDay, 0, 0, 0.0, oDate);
    if (oConverter.CalendarToJulian(nEpochYear, 1, 1, 0, 0, 0.0, oJan1) == 0) {
        sDay.nDayInEpochYear =
            static_cast<int>(std::lround(oDate.ToDouble() - oJan1.ToDouble())) + 1;
    }
    return sDay;
}

// Epoch year and seconds of the year of the element epoch (AVHRR header).
void ReadEpoch(const AvhrrData_t& sAvhrr, OrbitSetup& sOut) {
    const int nYearDay = ParseIntField(sAvhrr.szEpochYearDay, kFieldWidth, "szEpochYearDay",
                                       kFirstYear * 1000 + 1, kLastYear * 1000 + 366);
    sOut.nYear = nYearDay / 1000;
    const int nDay = nYearDay % 1000;
    if (nDay < 1 || nDay > DaysInYear(sOut.nYear)) {
        BadField("szEpochYearDay", FieldText(sAvhrr.szEpochYearDay, kFieldWidth),
                 MkName(_("has day %d, which year %d does not have"), nDay, sOut.nYear));
    }
    const int nHour = ParseIntField(sAvhrr.szEpochHour, kFieldWidth, "szEpochHour", 0, 23);
    const int nMinute = ParseIntField(sAvhrr.szEpochMinute, kFieldWidth, "szEpochMinute", 0, 59);
    const int nMs =
        ParseIntField(sAvhrr.szEpochMillisecond, kFieldWidth, "szEpochMillisecond", 0, 60999);
    const int nDerived = (nHour * 60 + nMinute) * 60000 + nMs;
    const int nStored = ParseIntField(sAvhrr.szEpochMsOfDay, kFieldWidth, "szEpochMsOfDay",
                                      -2147483647, 2147483647);
    if (nStored != nDerived) {
        PrintUserMessage(stdout, MkName("Warning: CEOS Epoch time within day value, %d,\nappears "
                                        "to be invalid. Using derived value, %d, instead.\n\n",
                                        nStored, nDerived));
    }
    sOut.dfEpochSec = (nDay - 1) * kSecondsPerDay + nDerived * 0.001;
}

void ReadAvhrrElements(const AvhrrData_t& sAvhrr, OrbitSetup& sOut) {
    double* el = sOut.adfElements;
    el[LRS_ELEM_A] =
        ParseField(sAvhrr.szSemiMajorAxis, kElementWidth, "szSemiMajorAxis", false) * 0.001;
    el[LRS_ELEM_E] =
        ParseField(sAvhrr.szEccentricity, kElementWidth, "szEccentricity", false) * 1e-8;
    const double dfScale = 1e-5 * kDegToRad;
    el[LRS_ELEM_I] =
        ParseField(sAvhrr.szInclination, kElementWidth, "szInclination", false) * dfScale;
    el[LRS_ELEM_NODE] =
        ParseField(sAvhrr.szAscNodeLongitude, kElementWidth, "szAscNodeLongitude", false) * dfScale;
    el[LRS_ELEM_PERIGEE] =
        ParseField(sAvhrr.szPerigeeArgument, kElementWidth, "szPerigeeArgument", false) * dfScale;
    el[LRS_ELEM_MEAN_ANOMALY] =
        ParseField(sAvhrr.szMeanAnomaly, kElementWidth, "szMeanAnomaly", false) * dfScale;
    sOut.dfGreenwich =
        ParseField(sAvhrr.szGreenwichAngle, kGreenwichWidth, "szGreenwichAngle", false) * 1e-4 *
        kDegToRad;
    static const char* const apszNames[LRS_NUM_ELEMENTS] = {
        "szSemiMajorAxis",    "szEccentricity",    "szInclination",
        "szAscNodeLongitude", "szPerigeeArgument", "szMeanAnomaly"};
    CheckMeanElements(el, apszNames);
}

void ReadOtherElements(const EphemerisSeg_t& sSeg, OrbitSetup& sOut) {
    double* el = sOut.adfElements;
    el[LRS_ELEM_A] = sSeg.dfOrbitRadius * 0.001;
    el[LRS_ELEM_E] = 0.00090254;
    el[LRS_ELEM_I] = sSeg.dfInclination;
    el[LRS_ELEM_NODE] = sSeg.dfAscNodeLongitude;
    el[LRS_ELEM_PERIGEE] = sSeg.dfPerigeeArgument;
    el[LRS_ELEM_MEAN_ANOMALY] = 1.9399310201307445;
    static const char* const apszNames[LRS_NUM_ELEMENTS] = {
        "dfOrbitRadius",      "eccentricity",      "dfInclination",
        "dfAscNodeLongitude", "dfPerigeeArgument", "mean anomaly"};
    CheckMeanElements(el, apszNames);
}

// Times of the first and last scan line from the epoch (AVHRR), from their
// time codes or, when those are unusable, from their GMT milliseconds.
void ReadAvhrrTimes(const EphemerisSeg_t& sSeg, const AvhrrData_t& sAvhrr, OrbitSetup& sOut) {
    const double dfClock =
        ParseField(sAvhrr.szClockOffset, kFieldWidth, "szClockOffset", false) * 0.001;
    const int nLast = sAvhrr.nNumScanLines - 1;
    const AvhrrLine_t& sFirst = sAvhrr.pScanLines[0];
    const AvhrrLine_t& sLastLine = sAvhrr.pScanLines[nLast];
    int nCodeDayF = 0, nCodeDayL = 0;
    const double dfFirst = CodeSeconds(sFirst, 0, dfClock, nCodeDayF);
    const double dfLast = CodeSeconds(sLastLine, nLast, dfClock, nCodeDayL);
    const int nDayF = 1 + static_cast<int>(std::floor(dfFirst / kSecondsPerDay));
    const int nDayL = 1 + static_cast<int>(std::floor(dfLast / kSecondsPerDay));
    const double dfFirstY = PlaceInEpochYear(dfFirst, sOut.nYear, sOut.dfEpochSec);
    const double dfLastY = PlaceInEpochYear(dfLast, sOut.nYear, sOut.dfEpochSec);
    sOut.dfStart = dfFirstY - sOut.dfEpochSec;
    sOut.dfEnd = dfLastY - sOut.dfEpochSec;

    const AcquisitionDay sAcq = ReadAcquisitionDay(sSeg, sOut.nYear);
    const int nDayFY = 1 + static_cast<int>(std::floor(dfFirstY / kSecondsPerDay));
    const bool bCodeDays = nCodeDayF >= 1 && nCodeDayF <= 366 && nCodeDayL >= 1 && nCodeDayL <= 366;
    const bool bReject = std::fabs(sOut.dfStart - sOut.dfEnd) < 0.001 || !bCodeDays || nDayF < 1 ||
                         nDayF > 366 || nDayL < 1 || nDayL > 366 ||
                         (sAcq.nDayOfYear >= 1 && std::abs(nDayFY - sAcq.nDayInEpochYear) >= 2);
    if (!bReject) return;
    PrintUserMessage(stdout,
                     "Using GMT time instead of satellite timecodes for orbital modeling.\n\n");
    if (sAcq.nDayOfYear < 1) {
        Fatal(Err::kBadArgument,
              MkName(_("AVHRR segment: the scan-line time codes are unusable and "
                       "szAcquisitionDate (\"%s\") gives no date for the lines' GMT times.\n"),
                     Printable(FieldText(sSeg.szAcquisitionDate, EPH_DATE_SIZE - 1)).c_str()));
    }
    const int anMs[2] = {sFirst.nTimeMs, sLastLine.nTimeMs};
    for (int k = 0; k < 2; ++k) {
        if (anMs[k] < 0 || anMs[k] > 86400999) {
            Fatal(Err::kBadArgument,
                  MkName(_("AVHRR segment: pScanLines[%d].nTimeMs is %d, not a time of day in "
                           "milliseconds.\n"),
                         k == 0 ? 0 : nLast, anMs[k]));
        }
    }
    const double dfDayStart = (sAcq.nDayInEpochYear - 1) * kSecondsPerDay - sOut.dfEpochSec;
    sOut.dfStart = anMs[0] / 1000.0 + dfDayStart;
    sOut.dfEnd = anMs[1] / 1000.0 + dfDayStart;
}

// Sensors other than AVHRR have no scan-line times: every line is placed at
// the acquisition day's start.
void ReadOtherTimes(const EphemerisSeg_t& sSeg, OrbitSetup& sOut) {
    const AcquisitionDay sAcq = ReadAcquisitionDay(sSeg, sOut.nYear);
    PrintUserMessage(stdout,
                     "Using GMT time instead of satellite timecodes for orbital modeling.\n\n");
    sOut.dfStart = sOut.dfEnd = (sAcq.nDayOfYear - 1) * kSecondsPerDay - sOut.dfEpochSec;
}

void CheckPassTimes(const OrbitSetup& sOut) {
    const double dfLimit = kMaxDaysFromEpoch * kSecondsPerDay;
    if (!(std::fabs(sOut.dfStart) <= dfLimit && std::fabs(sOut.dfEnd) <= dfLimit)) {
        Fatal(Err::kBadArgument,
              MkName(_("AVHRR segment: the scan lines lie %.6g and %.6g days from the element "
                       "epoch (szEpochYearDay); one element set cannot model them.\n"),
                     sOut.dfStart / kSecondsPerDay, sOut.dfEnd / kSecondsPerDay));
    }
    // The state table spans the pass and one more line interval.
    const double dfSpan = std::fabs(sOut.dfEnd - sOut.dfStart);
    if (dfSpan * sOut.nLines / (sOut.nLines - 1) > kMaxPassSeconds) {
        Fatal(Err::kBadArgument,
              MkName(_("AVHRR segment: the first and last of %d scan lines are %.6g s apart, more "
                       "than one pass (check the scan-line time codes).\n"),
                     sOut.nLines, dfSpan));
    }
}

}  // namespace

void CheckMeanElements(const double* el, const char* const* papszNames) {
    const char* pszWhy = nullptr;
    int k = 0;
    for (; k < LRS_NUM_ELEMENTS && pszWhy == nullptr; ++k) {
        if (!std::isfinite(el[k])) pszWhy = "is not a finite number";
    }
    if (pszWhy == nullptr) {
        if (!(el[LRS_ELEM_E] >= 0.0 && el[LRS_ELEM_E] < 1.0)) {
            k = LRS_ELEM_E + 1;
            pszWhy = "is not an eccentricity in [0, 1)";
        } else if (!(el[LRS_ELEM_A] * (1.0 - el[LRS_ELEM_E]) > LRS_EARTH_RADIUS)) {
            k = LRS_ELEM_A + 1;
            pszWhy = "puts the perigee below the Earth's surface";
        } else if (!(el[LRS_ELEM_I] >= 0.0 && el[LRS_ELEM_I] <= 179.9 * kDegToRad)) {
            k = LRS_ELEM_I + 1;
            pszWhy = "is not an inclination in [0, 179.9] degrees";
        }
    }
    if (pszWhy == nullptr) return;
    Fatal(Err::kBadArgument, MkName(_("Orbit model: %s gives the mean element %.17g, which %s.\n"),
                                    papszNames[k - 1], el[k - 1], pszWhy));
}

OrbitSetup ReadOrbitSetup(const EphemerisSeg_t& sSeg) {
    OrbitSetup sOut;
    if (IsAvhrr(sSeg)) {
        const AvhrrData_t& sAvhrr = RequireAvhrr(sSeg);
        ReadEpoch(sAvhrr, sOut);
        ReadAvhrrElements(sAvhrr, sOut);
        ReadAvhrrTimes(sSeg, sAvhrr, sOut);
        // A pass over midnight read from GMT times: the end moves by a day
        // to the side the time direction expects.
        const bool bBackward = sAvhrr.nTimeDirection != 0;
        if ((bBackward && sOut.dfEnd > sOut.dfStart) || (!bBackward && sOut.dfStart > sOut.dfEnd)) {
            PrintUserMessage(stdout,
                             "Warning: Image crosses over 0h GMT - adjusting end time for "
                             "orbital modeling.\n\n");
            sOut.dfEnd += bBackward ? -kSecondsPerDay : kSecondsPerDay;
        }
        sOut.nLines = sAvhrr.nNumScanLines;
        CheckPassTimes(sOut);
        return sOut;
    }
    if (sSeg.nNumLines < 2) {
        Fatal(Err::kBadArgument,
              MkName(_("Orbit model: segment field nNumLines is %d; at least 2 image lines are "
                       "needed.\n"),
                     static_cast<int>(sSeg.nNumLines)));
    }
    sOut.dfEpochSec = -kSecondsPerDay;  // no epoch day: day 0 of year 0
    ReadOtherElements(sSeg, sOut);
    ReadOtherTimes(sSeg, sOut);
    sOut.nLines = sSeg.nNumLines;
    return sOut;
}

}  // namespace lumo::lrs
