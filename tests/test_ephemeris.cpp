// Ephemeris segments: deep copy, assignment and release of every sub-record
// kind, including line counts that disagree with their line arrays.
#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <memory>

#include "lumo.h"
#include "runtime.h"
#include "support/segments.h"

namespace {

using lumo::cli::SegmentPtr;
using lumo::support::Attach;
using lumo::support::ExpectSameSegment;
using lumo::support::RandomSegment;
using lumo::support::SubRecord;
using lumo::support::Zeroed;

// Drops the line array of a segment's sub-record, leaving its count.
template <typename Sub, typename Line>
void DropLines(EphemerisSeg_t* psSeg, Line* Sub::*ppLines) {
    Sub* psSub = SubRecord<Sub>(psSeg);
    std::free(psSub->*ppLines);
    psSub->*ppLines = nullptr;
}

// The fixed blocks' layout, which stored segments and hosts rely on.
static_assert(offsetof(AvhrrLine_t, nTimeMs) == 4u, "AVHRR line layout");
static_assert(offsetof(AvhrrLine_t, abyTimeCode) == 28u, "AVHRR line layout");
static_assert(offsetof(RadarData_t, nNumLinePositions) == 108u, "radar record layout");
static_assert(offsetof(AvhrrData_t, nTimeDirection) == 64u, "AVHRR record layout");
static_assert(offsetof(AvhrrData_t, szEpochYearDay) == 68u + 2 * 17u, "AVHRR record layout");
static_assert(offsetof(AvhrrData_t, szField26) == 68u + 25 * 17u, "AVHRR record layout");
static_assert(sizeof(EphemerisSeg_t{}.szAcquisitionDate) == 28u, "segment layout");
static_assert(sizeof(EphemerisSeg_t{}.adfLevelConvCoefs) == 39 * sizeof(double), "segment layout");

// Every kind: the duplicate and the copies into another segment (a new one,
// and a radar segment whose sub-record is released) equal their source byte
// for byte, in blocks of their own, and stand alone once it is released.
TEST(EphemerisCopies, EveryKindCopiesAndOutlivesItsSource) {
    for (int nKind : {EPH_ORBIT_NONE, EPH_ORBIT_ATTITUDE, EPH_ORBIT_RADAR, EPH_ORBIT_AVHRR}) {
        SCOPED_TRACE("kind " + std::to_string(nKind));
        SegmentPtr poSrc = RandomSegment(nKind, 5, 40u + nKind);
        EphemerisSeg_t* psSrc = poSrc.get();
        EphemerisSeg_t* psNew = nullptr;
        EphemerisSeg_t* psReplaced = RandomSegment(EPH_ORBIT_RADAR, 6, 7u).release();
        EphemerisSegCopyInto(&psNew, &psSrc);
        EphemerisSegCopyInto(&psReplaced, &psSrc);
        const SegmentPtr apoCopies[] = {SegmentPtr(EphemerisSegDuplicate(psSrc)), SegmentPtr(psNew),
                                        SegmentPtr(psReplaced)};
        for (const SegmentPtr& poCopy : apoCopies) {
            ASSERT_NE(poCopy, nullptr);
            if (nKind == EPH_ORBIT_NONE) continue;
            EXPECT_NE(poCopy->ppOrbitData, psSrc->ppOrbitData);
            EXPECT_NE(*poCopy->ppOrbitData, *psSrc->ppOrbitData);
        }
        poSrc.reset();
        const SegmentPtr poExpected = RandomSegment(nKind, 5, 40u + nKind);
        for (const SegmentPtr& poCopy : apoCopies) ExpectSameSegment(*poCopy, *poExpected);
    }
    EXPECT_EQ(EphemerisSegDuplicate(nullptr), nullptr);
}

TEST(EphemerisDuplicate, UnknownKindAndEmptyHolder) {
    // Kind 5 with a holder: the copy keeps the kind and gets no holder, and
    // releasing the source frees the holder only.
    SegmentPtr poOdd = RandomSegment(EPH_ORBIT_NONE, 0, 1u);
    std::unique_ptr<double, nova::FreeDeleter> poForeign(Zeroed<double>(4));
    Attach(poOdd.get(), 5, poForeign.get());
    SegmentPtr poCopy(EphemerisSegDuplicate(poOdd.get()));
    EXPECT_EQ(poCopy->nOrbitType, 5);
    EXPECT_EQ(poCopy->ppOrbitData, nullptr);
    poOdd.reset();
    poForeign.get()[3] = 1.0;  // still owned by the test, not freed

    // A holder whose sub-record pointer is null.
    SegmentPtr poHollow = RandomSegment(EPH_ORBIT_NONE, 0, 2u);
    Attach(poHollow.get(), EPH_ORBIT_RADAR, nullptr);
    SegmentPtr poHollowCopy(EphemerisSegDuplicate(poHollow.get()));
    EXPECT_EQ(poHollowCopy->ppOrbitData, nullptr);
    EXPECT_EQ(poHollowCopy->nOrbitType, EPH_ORBIT_RADAR);

    LumoSatEphemerisFree(nullptr);
}

// A count that disagrees with its line array is never followed. The
// duplicate keeps the sub-record without lines and the count as it is
// (EphemerisSegValidate refuses it); a copy into another segment copies a
// sub-record whose count is negative without lines, and leaves out one
// whose line array is missing.
TEST(EphemerisCopies, CountsThatDisagreeWithTheirArray) {
    SegmentPtr poNegative = RandomSegment(EPH_ORBIT_RADAR, 2, 3u);
    SubRecord<RadarData_t>(poNegative.get())->nNumLinePositions = -4;
    EphemerisSeg_t* psNegative = poNegative.get();
    SegmentPtr poInto = RandomSegment(EPH_ORBIT_AVHRR, 2, 9u);
    EphemerisSeg_t* psInto = poInto.get();
    EphemerisSegCopyInto(&psInto, &psNegative);
    const SegmentPtr poDuplicate(EphemerisSegDuplicate(psNegative));
    for (const EphemerisSeg_t* psCopy : {psInto, poDuplicate.get()}) {
        const RadarData_t* psRadar = SubRecord<RadarData_t>(psCopy);
        ASSERT_NE(psRadar, nullptr);
        EXPECT_EQ(psRadar->pLinePositions, nullptr);
        EXPECT_EQ(psRadar->nNumLinePositions, -4);
        EXPECT_EQ(std::memcmp(psRadar->abyLeading, SubRecord<RadarData_t>(psNegative)->abyLeading,
                              RADAR_LEADING_SIZE),
                  0);
    }

    // Line arrays gone, counts left.
    SegmentPtr poAtt = RandomSegment(EPH_ORBIT_ATTITUDE, 7, 4u);
    DropLines(poAtt.get(), &AttitudeData_t::pAttitudeLines);
    SegmentPtr poAttCopy(EphemerisSegDuplicate(poAtt.get()));
    const AttitudeData_t* psAtt = SubRecord<AttitudeData_t>(poAttCopy.get());
    ASSERT_NE(psAtt, nullptr);
    EXPECT_EQ(psAtt->pAttitudeLines, nullptr);
    EXPECT_EQ(psAtt->nNumAttitudeLines, 7);
    EXPECT_EQ(psAtt->dfAttitude3, SubRecord<AttitudeData_t>(poAtt.get())->dfAttitude3);
    SegmentPtr poAvhrr = RandomSegment(EPH_ORBIT_AVHRR, 7, 4u);
    DropLines(poAvhrr.get(), &AvhrrData_t::pScanLines);
    SegmentPtr poAvhrrCopy(EphemerisSegDuplicate(poAvhrr.get()));
    EXPECT_EQ(SubRecord<AvhrrData_t>(poAvhrrCopy.get())->pScanLines, nullptr);
    EXPECT_EQ(SubRecord<AvhrrData_t>(poAvhrrCopy.get())->nNumScanLines, 7);
    for (int32_t nCount : {7, 0}) {
        SubRecord<AttitudeData_t>(poAtt.get())->nNumAttitudeLines = nCount;
        EphemerisSeg_t* psAttSrc = poAtt.get();
        EphemerisSegCopyInto(&psInto, &psAttSrc);
        EXPECT_EQ(psInto->nOrbitType, EPH_ORBIT_ATTITUDE);
        EXPECT_EQ(psInto->ppOrbitData, nullptr) << nCount;
    }
}

TEST(EphemerisFreeOrbit, KeepsTheMainRecord) {
    SegmentPtr poSeg = RandomSegment(EPH_ORBIT_AVHRR, 3, 5u);
    const SegmentPtr poMain = RandomSegment(EPH_ORBIT_NONE, 0, 5u);
    EphemerisSegFreeOrbit(poSeg.get());
    EXPECT_EQ(poSeg->ppOrbitData, nullptr);
    EXPECT_EQ(poSeg->nOrbitType, 0);
    ExpectSameSegment(*poSeg, *poMain);

    poSeg->nOrbitType = 2;  // a kind without holder
    EphemerisSegFreeOrbit(poSeg.get());
    EXPECT_EQ(poSeg->nOrbitType, 0);
    EphemerisSegFreeOrbit(nullptr);
}

TEST(EphemerisCopyInto, SameRecordOrSharedSegmentChangesNothing) {
    SegmentPtr poSeg = RandomSegment(EPH_ORBIT_RADAR, 2, 11u);
    EphemerisSeg_t* psSeg = poSeg.get();
    void** ppHolder = psSeg->ppOrbitData;
    EphemerisSegCopyInto(&psSeg, &psSeg);
    EphemerisSeg_t* psAlias = psSeg;
    EphemerisSegCopyInto(&psAlias, &psSeg);  // two records sharing one segment
    EXPECT_EQ(psSeg->ppOrbitData, ppHolder);
    ExpectSameSegment(*psSeg, *RandomSegment(EPH_ORBIT_RADAR, 2, 11u));
    EphemerisSegCopyInto(nullptr, &psSeg);
    EphemerisSegCopyInto(&psAlias, nullptr);
    EXPECT_EQ(psAlias, psSeg);

    // Neither has a segment; a source without a segment releases the
    // destination's.
    EphemerisSeg_t* psNone = nullptr;
    EphemerisSeg_t* psDst = nullptr;
    EphemerisSegCopyInto(&psDst, &psNone);
    EXPECT_EQ(psDst, nullptr);
    psDst = RandomSegment(EPH_ORBIT_ATTITUDE, 4, 6u).release();
    EphemerisSegCopyInto(&psDst, &psNone);
    EXPECT_EQ(psDst, nullptr);
}

}  // namespace
