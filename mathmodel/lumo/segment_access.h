// Reading an ephemeris segment: its sensor name, which may fill its whole
// field without a terminator, and its attitude sub-record (kind 1) with the
// per-line table. One definition for every family that reads a segment.
#pragma once

#include <cstddef>
#include <string>

#include "lumo_types.h"

namespace lumo {

// True when the first nSize characters at pszName (fewer when a terminator
// comes first) begin with pszPrefix, ASCII letters compared without case.
bool NameHasPrefix(const char* pszName, std::size_t nSize, const char* pszPrefix);
bool SensorNameStartsWith(const EphemerisSeg_t& sSeg, const char* pszPrefix);
// The sensor name as a terminated text.
std::string SensorNameOf(const EphemerisSeg_t& sSeg);

// The attitude sub-record of a kind-1 segment, or null.
const AttitudeData_t* AttitudeRecordOf(const EphemerisSeg_t* psSeg);
// The same when it holds a per-line table (at least one line and its
// array), or null.
const AttitudeData_t* AttitudeLinesOf(const EphemerisSeg_t* psSeg);

}  // namespace lumo
