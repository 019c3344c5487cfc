// Reading an ephemeris segment's sensor name and attitude sub-record.
#include "segment_access.h"

namespace lumo {
namespace {

char AsciiUpper(char c) {
    return (c >= 'a' && c <= 'z') ? static_cast<char>(c - 'a' + 'A') : c;
}

}  // namespace

bool NameHasPrefix(const char* pszName, std::size_t nSize, const char* pszPrefix) {
    for (std::size_t i = 0; pszPrefix[i] != '\0'; ++i) {
        if (i >= nSize || pszName[i] == '\0') return false;
        if (AsciiUpper(pszName[i]) != AsciiUpper(pszPrefix[i])) return false;
    }
    return true;
}

bool SensorNameStartsWith(const EphemerisSeg_t& sSeg, const char* pszPrefix) {
    return NameHasPrefix(sSeg.szSensorName, sizeof(sSeg.szSensorName), pszPrefix);
}

std::string SensorNameOf(const EphemerisSeg_t& sSeg) {
    std::size_t n = 0;
    while (n < sizeof(sSeg.szSensorName) && sSeg.szSensorName[n] != '\0') ++n;
    return std::string(sSeg.szSensorName, n);
}

const AttitudeData_t* AttitudeRecordOf(const EphemerisSeg_t* psSeg) {
    if (psSeg == nullptr || psSeg->nOrbitType != EPH_ORBIT_ATTITUDE ||
        psSeg->ppOrbitData == nullptr) {
        return nullptr;
    }
    return static_cast<const AttitudeData_t*>(*psSeg->ppOrbitData);
}

const AttitudeData_t* AttitudeLinesOf(const EphemerisSeg_t* psSeg) {
    const AttitudeData_t* psRecord = AttitudeRecordOf(psSeg);
    if (psRecord == nullptr || psRecord->pAttitudeLines == nullptr ||
        psRecord->nNumAttitudeLines < 1) {
        return nullptr;
    }
    return psRecord;
}

}  // namespace lumo
