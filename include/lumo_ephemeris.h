// Copying and releasing ephemeris segments (EphemerisSeg_t, lumo_types.h).
//
// Every block of a segment comes from the host allocator and is released with
// free(). A line count that disagrees with its line array is handled safely:
// a count below 1 or a null array yields a sub-record without a line array,
// never an out-of-bounds read or write.
#pragma once

#include <string>

#include "lumo_types.h"

// A new, independently owned deep copy of psSrc; null when psSrc is null.
LUMO_API EphemerisSeg_t* EphemerisSegDuplicate(const EphemerisSeg_t* psSrc);

// Releases a segment with its holder, sub-record and line array. Null is ignored.
LUMO_API void LumoSatEphemerisFree(EphemerisSeg_t* psSeg);
// Why a segment cannot be used by the models, naming the field and its
// value; empty when it can: image and table line counts from 0 to
// 10,000,000, a line table present when its count is, an orbit kind that
// matches its sub-record, a level conversion form of 0, 20 or 39. Every
// reader of a segment runs it.
LUMO_API std::string EphemerisSegValidate(const EphemerisSeg_t* psSeg);

// Makes the segment owned through *ppsDst equal to the one owned through
// *ppsSrc, creating or releasing the destination segment as needed. The two
// arguments are the segment slots of two model records; a null slot, the same
// slot twice, or two slots holding the same segment change nothing.
// A source sub-record without a line array is not copied, but its kind is.
LUMO_API void EphemerisSegCopyInto(EphemerisSeg_t** ppsDst, EphemerisSeg_t* const* ppsSrc);

// Releases the orbit sub-record of a segment (holder, sub-record, line array)
// and keeps the main record; afterwards nOrbitType is 0. Null is ignored.
LUMO_API void EphemerisSegFreeOrbit(EphemerisSeg_t* psSeg);
