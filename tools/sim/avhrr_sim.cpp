#include "avhrr_sim.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <random>
#include <stdexcept>
#include <string>

#include <erfa.h>

#include "lumo_ephemeris.h"
#include "runtime.h"
#include "sim_math.h"
#include "timesys.h"

namespace lumo::sim {
namespace {

constexpr double kSecondsPerDay = 86400.0;
constexpr double kLinesPerSecond = 6.0;

int DaysInYear(int nYear) {
    return ((nYear % 4 == 0 && nYear % 100 != 0) || nYear % 400 == 0) ? 366 : 365;
}

// Writes a value into a 16-character header field, right-aligned in the
// given width.
void PutField(char* pszField, const char* pszFormat, long long nValue) {
    char szText[AVHRR_FIELD_SIZE + 8];
    std::snprintf(szText, sizeof szText, pszFormat, nValue);
    Require(std::strlen(szText) < AVHRR_FIELD_SIZE, "orbit header value",
            static_cast<double>(nValue), "does not fit the header's 16-character field");
    std::strcpy(pszField, szText);
}

// Element scaled to an integer of the header and checked against the
// field's eight characters.
long long ScaledElement(double dfValue, double dfScale, const char* pszName) {
    const double dfScaled = std::round(dfValue * dfScale);
    Require(dfScaled >= 0.0 && dfScaled <= 99999999.0, pszName, dfValue,
            "does not fit the orbit header's eight digits");
    return static_cast<long long>(dfScaled);
}

double Wrap360(double dfDegrees) {
    const double r = std::fmod(dfDegrees, 360.0);
    return r < 0.0 ? r + 360.0 : r;
}

// Greenwich mean sidereal angle (degrees) at the epoch, UT1 taken as UTC.
double GreenwichAngle(const AvhrrPassSpec& s) {
    const nova::tsys::TimeSystemConverter oConverter;
    nova::tsys::Timestamp oUtc;
    oConverter.CalendarToJulian(s.nEpochYear, 1, 1, 0, 0, 0.0, oUtc);
    oUtc += (s.nEpochDay - 1) + s.dfEpochSecondOfDay / kSecondsPerDay;
    return eraGmst82(oUtc.GetDay(), oUtc.GetFraction()) * 180.0 / kPi;
}

void FillHeader(const AvhrrPassSpec& s, AvhrrData_t& h) {
    const long long nMsOfDay = std::llround(s.dfEpochSecondOfDay * 1000.0);
    PutField(h.szEpochYearDay, "%lld", s.nEpochYear * 1000LL + s.nEpochDay);
    PutField(h.szEpochMsOfDay, "%lld", nMsOfDay);
    std::snprintf(h.szClockOffset, AVHRR_FIELD_SIZE, "%.3f", s.dfClockOffsetMs);
    PutField(h.szEpochHour, "%lld", nMsOfDay / 3600000);
    PutField(h.szEpochMinute, "%lld", (nMsOfDay / 60000) % 60);
    PutField(h.szEpochMillisecond, "%lld", nMsOfDay % 60000);
    PutField(h.szGreenwichAngle, "%7lld", std::llround(Wrap360(GreenwichAngle(s)) * 1e4) % 3600000);
    PutField(h.szSemiMajorAxis, "%8lld",
             ScaledElement(s.dfSemiMajorAxis, 1000.0, "semi-major axis"));
    PutField(h.szEccentricity, "%8lld", ScaledElement(s.dfEccentricity, 1e8, "eccentricity"));
    PutField(h.szInclination, "%8lld", ScaledElement(s.dfInclination, 1e5, "inclination"));
    PutField(h.szAscNodeLongitude, "%8lld", ScaledElement(Wrap360(s.dfNode), 1e5, "node"));
    PutField(h.szPerigeeArgument, "%8lld", ScaledElement(Wrap360(s.dfPerigee), 1e5, "perigee"));
    PutField(h.szMeanAnomaly, "%8lld",
             ScaledElement(Wrap360(s.dfMeanAnomaly), 1e5, "mean anomaly"));
}

// Time code and GMT milliseconds of a scan line at seconds u of the epoch
// year (the code carries no year: a line past New Year counts from day 1).
void FillLine(double u, int nYear, double dfClockMs, AvhrrLine_t& sLine) {
    const double dfDayMs = std::fmod(u, kSecondsPerDay) * 1000.0;
    sLine.nTimeMs = static_cast<int32_t>(std::llround(dfDayMs)) % 86400000;
    double dfCode = u - dfClockMs * 0.001;  // the codes are read with the offset added back
    if (dfCode >= DaysInYear(nYear) * kSecondsPerDay) dfCode -= DaysInYear(nYear) * kSecondsPerDay;
    const long long nTenThousandths = std::llround(dfCode * 1e4);
    const long long nSeconds = nTenThousandths / 10000;
    const int nDay = static_cast<int>(nSeconds / 86400) + 1;
    const long long nSecondOfDay = nSeconds % 86400;
    uint8_t* c = sLine.abyTimeCode;
    c[0] = static_cast<uint8_t>(nDay / 100);
    c[1] = static_cast<uint8_t>(nDay % 100);
    c[2] = static_cast<uint8_t>(nSecondOfDay / 3600);
    c[3] = static_cast<uint8_t>((nSecondOfDay / 60) % 60);
    c[4] = static_cast<uint8_t>(nSecondOfDay % 60);
    c[5] = static_cast<uint8_t>((nTenThousandths % 10000) / 100);
    c[6] = static_cast<uint8_t>(nTenThousandths % 100);
}

void FillAcquisitionDate(const AvhrrPassSpec& s, EphemerisSeg_t& sSeg) {
    const nova::tsys::TimeSystemConverter oConverter;
    nova::tsys::Timestamp oDate;
    oConverter.CalendarToJulian(s.nEpochYear, 1, 1, 0, 0, 0.0, oDate);
    oDate += (s.nEpochDay - 1) + (s.dfEpochSecondOfDay + s.dfStartSeconds) / kSecondsPerDay;
    int nYear = 0, nMonth = 0, nDay = 0;
    double dfFraction = 0.0;
    oConverter.JulianToCalendar(oDate, nYear, nMonth, nDay, dfFraction);
    const int nSecond = static_cast<int>(dfFraction * kSecondsPerDay);
    std::snprintf(sSeg.szAcquisitionDate, EPH_DATE_SIZE, "%04d-%02d-%02d %02d:%02d:%02d", nYear,
                  nMonth, nDay, nSecond / 3600, (nSecond / 60) % 60, nSecond % 60);
}

}  // namespace

EphemerisSeg_t* MakeAvhrrSegment(const AvhrrPassSpec& s) {
    Require(s.nEpochYear >= 1900 && s.nEpochYear <= 2199, "epoch year", s.nEpochYear,
            "must lie in 1900..2199");
    Require(s.nEpochDay >= 1 && s.nEpochDay <= DaysInYear(s.nEpochYear), "epoch day", s.nEpochDay,
            DaysInYear(s.nEpochYear) == 366 ? "must lie in 1..366 (a leap year)"
                                            : "must lie in 1..365 (not a leap year)");
    Require(s.dfEpochSecondOfDay >= 0.0 && s.dfEpochSecondOfDay < kSecondsPerDay,
            "epoch second of the day", s.dfEpochSecondOfDay, "must lie in [0, 86400)");
    Require(s.nLines >= 2 && s.nLines <= 200000, "line count", s.nLines, "must lie in 2..200000");
    Require(std::isfinite(s.dfStartSeconds) && std::fabs(s.dfStartSeconds) < 30 * kSecondsPerDay,
            "start", s.dfStartSeconds, "must lie within 30 days (2592000 s) of the epoch");
    Require(std::isfinite(s.dfClockOffsetMs) && std::fabs(s.dfClockOffsetMs) < 1e6, "clock offset",
            s.dfClockOffsetMs, "must lie within (-1e6, 1e6) milliseconds");

    auto* psSeg = static_cast<EphemerisSeg_t*>(HCalloc(1, sizeof(EphemerisSeg_t)));
    std::strcpy(psSeg->szSensorName, "AVHRR");
    FillAcquisitionDate(s, *psSeg);
    psSeg->nNumLines = s.nLines;
    psSeg->nNumPixels = 2048;
    psSeg->nBytesPerPixel = 2;
    psSeg->nOrbitType = EPH_ORBIT_AVHRR;
    psSeg->ppOrbitData = static_cast<void**>(HMalloc(sizeof(void*)));
    auto* psAvhrr = static_cast<AvhrrData_t*>(HCalloc(1, sizeof(AvhrrData_t)));
    *psSeg->ppOrbitData = psAvhrr;
    psAvhrr->nTimeDirection = s.bBackward ? 1 : 0;
    psAvhrr->nNumScanLines = s.nLines;
    psAvhrr->pScanLines = static_cast<AvhrrLine_t*>(HCalloc(s.nLines, sizeof(AvhrrLine_t)));
    try {
        FillHeader(s, *psAvhrr);
    } catch (...) {
        LumoSatEphemerisFree(psSeg);
        throw;
    }
    const double dfEpoch = (s.nEpochDay - 1) * kSecondsPerDay + s.dfEpochSecondOfDay;
    for (int k = 0; k < s.nLines; ++k) {
        const int nOrder = s.bBackward ? s.nLines - 1 - k : k;
        const double u = dfEpoch + s.dfStartSeconds + nOrder / kLinesPerSecond;
        psAvhrr->pScanLines[k].nCarried = k + 1;
        FillLine(u, s.nEpochYear, s.dfClockOffsetMs, psAvhrr->pScanLines[k]);
    }
    return psSeg;
}

void ApplyBias(const AvhrrBias& b, LRSOrbitModel_t* psModel) {
    // Beyond these the "true" pass no longer sees the nominal one's ground.
    Require(std::isfinite(b.dfRollDeg) && std::fabs(b.dfRollDeg) <= 10.0, "roll bias", b.dfRollDeg,
            "must lie within [-10, 10] degrees");
    Require(std::isfinite(b.dfPitchDeg) && std::fabs(b.dfPitchDeg) <= 10.0, "pitch bias",
            b.dfPitchDeg, "must lie within [-10, 10] degrees");
    Require(std::isfinite(b.dfYawDeg) && std::fabs(b.dfYawDeg) <= 10.0, "yaw bias", b.dfYawDeg,
            "must lie within [-10, 10] degrees");
    Require(std::isfinite(b.dfAlongTrackKm) && std::fabs(b.dfAlongTrackKm) <= 500.0,
            "along-track bias", b.dfAlongTrackKm, "must lie within [-500, 500] km");
    const double dfDeg = kPi / 180.0;
    psModel->adfRollPoly[1] += b.dfRollDeg * dfDeg;
    psModel->adfPitchPoly[1] += b.dfPitchDeg * dfDeg;
    psModel->adfYawPoly[1] += b.dfYawDeg * dfDeg;
    psModel->adfOrbitCorr[1] += b.dfAlongTrackKm / psModel->adfMeanElements[LRS_ELEM_A];
}

std::vector<ControlPoint_t> SampleAvhrrPoints(const LRSOrbitModel_t& sTruth, int nCols, int nRows,
                                              double dfMargin, double dfMaxHeight,
                                              std::uint32_t nSeed) {
    std::mt19937 oRandom(nSeed);
    std::uniform_real_distribution<double> oHeight(0.0, std::max(0.0, dfMaxHeight));
    const double dfWidth = sTruth.sSensor.nNumPixels - 2.0 * dfMargin;
    const double dfHeight = sTruth.nNumScanLines - 2.0 * dfMargin;
    std::vector<ControlPoint_t> asPoints;
    for (int j = 0; j < nRows; ++j) {
        for (int i = 0; i < nCols; ++i) {
            ControlPoint_t p{};
            p.dfImageX = dfMargin + dfWidth * (nCols > 1 ? i / (nCols - 1.0) : 0.5);
            p.dfImageY = dfMargin + dfHeight * (nRows > 1 ? j / (nRows - 1.0) : 0.5);
            p.dfGroundZ = oHeight(oRandom);
            if (LRSImageToGeodeticAtHeight(&sTruth, p.dfImageX, p.dfImageY, p.dfGroundZ,
                                           &p.dfGroundX, &p.dfGroundY) == 1) {
                asPoints.push_back(p);
            }
        }
    }
    return asPoints;
}

}  // namespace lumo::sim
