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

TEST(EphemerisRecord, LayoutOfFixedBlocks) {
    EXPECT_EQ(sizeof(AvhrrLine_t), 80u);
    EXPECT_EQ(offsetof(AvhrrLine_t, nTimeMs), 4u);
    EXPECT_EQ(offsetof(AvhrrLine_t, abyTimeCode), 28u);
    EXPECT_EQ(offsetof(RadarData_t, nNumLinePositions), 108u);
    EXPECT_EQ(offsetof(AvhrrData_t, nTimeDirection), 64u);
    EXPECT_EQ(offsetof(AvhrrData_t, szEpochYearDay), 68u + 2 * 17u);
    EXPECT_EQ(offsetof(AvhrrData_t, szField26), 68u + 25 * 17u);
    EXPECT_EQ(sizeof(EphemerisSeg_t{}.szAcquisitionDate), 28u);
    EXPECT_EQ(sizeof(EphemerisSeg_t{}.adfLevelConvCoefs), 39 * sizeof(double));
}

// Every kind: the copy equals its source byte for byte and stands alone once
// the source is released.
TEST(EphemerisDuplicate, CopiesOfEveryKindOutliveTheirSource) {
    for (int nKind : {EPH_ORBIT_NONE, EPH_ORBIT_ATTITUDE, EPH_ORBIT_RADAR, EPH_ORBIT_AVHRR}) {
        SCOPED_TRACE("kind " + std::to_string(nKind));
        SegmentPtr poSrc = RandomSegment(nKind, 5, 40u + nKind);
        SegmentPtr poCopy(EphemerisSegDuplicate(poSrc.get()));
        ASSERT_NE(poCopy, nullptr);
        if (nKind != EPH_ORBIT_NONE) {
            EXPECT_NE(poCopy->ppOrbitData, poSrc->ppOrbitData);
            EXPECT_NE(*poCopy->ppOrbitData, *poSrc->ppOrbitData);
        }
        poSrc.reset();
        ExpectSameSegment(*poCopy, *RandomSegment(nKind, 5, 40u + nKind));
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

// A count that disagrees with its array is never followed: the copy holds no
// line array and keeps the count as it is (EphemerisSegValidate refuses it).
TEST(EphemerisDuplicate, CountDisagreeingWithArray) {
    SegmentPtr poNegative = RandomSegment(EPH_ORBIT_RADAR, 2, 3u);
    SubRecord<RadarData_t>(poNegative.get())->nNumLinePositions = -4;
    SegmentPtr poCopy(EphemerisSegDuplicate(poNegative.get()));
    const RadarData_t* psRadar = SubRecord<RadarData_t>(poCopy.get());
    ASSERT_NE(psRadar, nullptr);
    EXPECT_EQ(psRadar->pLinePositions, nullptr);
    EXPECT_EQ(psRadar->nNumLinePositions, -4);

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

TEST(EphemerisCopyInto, CreatesReplacesAndReleases) {
    EphemerisSeg_t* psDst = nullptr;
    EphemerisSeg_t* psSrc = nullptr;
    EphemerisSegCopyInto(&psDst, &psSrc);  // neither has a segment
    EXPECT_EQ(psDst, nullptr);

    SegmentPtr poSrc = RandomSegment(EPH_ORBIT_ATTITUDE, 4, 6u);
    psSrc = poSrc.get();
    EphemerisSegCopyInto(&psDst, &psSrc);  // destination created
    SegmentPtr poDst(psDst);
    ASSERT_NE(psDst, nullptr);
    EXPECT_NE(SubRecord<AttitudeData_t>(psDst), SubRecord<AttitudeData_t>(psSrc));
    ExpectSameSegment(*psDst, *psSrc);

    // Replace an existing radar segment: the old sub-record is released.
    SegmentPtr poRadar = RandomSegment(EPH_ORBIT_RADAR, 6, 7u);
    EphemerisSeg_t* psRadar = poRadar.release();
    EphemerisSegCopyInto(&psRadar, &psSrc);
    poRadar.reset(psRadar);
    poSrc.reset();  // the copies stand alone
    psSrc = nullptr;
    const SegmentPtr poExpected = RandomSegment(EPH_ORBIT_ATTITUDE, 4, 6u);
    ExpectSameSegment(*psRadar, *poExpected);
    ExpectSameSegment(*psDst, *poExpected);

    // A source without a segment releases the destination's.
    psDst = poDst.release();
    EphemerisSegCopyInto(&psDst, &psSrc);
    EXPECT_EQ(psDst, nullptr);
}

TEST(EphemerisCopyInto, SubRecordWithoutLinesIsNotCopied) {
    SegmentPtr poSrc = RandomSegment(EPH_ORBIT_ATTITUDE, 2, 8u);
    DropLines(poSrc.get(), &AttitudeData_t::pAttitudeLines);
    SubRecord<AttitudeData_t>(poSrc.get())->nNumAttitudeLines = 0;
    EphemerisSeg_t* psSrc = poSrc.get();
    SegmentPtr poDst = RandomSegment(EPH_ORBIT_AVHRR, 2, 9u);
    EphemerisSeg_t* psDst = poDst.release();
    EphemerisSegCopyInto(&psDst, &psSrc);
    poDst.reset(psDst);
    EXPECT_EQ(psDst->nOrbitType, EPH_ORBIT_ATTITUDE);
    EXPECT_EQ(psDst->ppOrbitData, nullptr);

    // Null array with a positive count: the same, nothing read.
    SubRecord<AttitudeData_t>(psSrc)->nNumAttitudeLines = 12;
    EphemerisSegCopyInto(&psDst, &psSrc);
    EXPECT_EQ(psDst->ppOrbitData, nullptr);

    // An array with a negative count: the sub-record is copied, no lines.
    SegmentPtr poNeg = RandomSegment(EPH_ORBIT_RADAR, 3, 10u);
    RadarData_t* psNegRadar = SubRecord<RadarData_t>(poNeg.get());
    psNegRadar->nNumLinePositions = -1;
    EphemerisSeg_t* psNeg = poNeg.get();
    EphemerisSegCopyInto(&psDst, &psNeg);
    const RadarData_t* psRadar = SubRecord<RadarData_t>(psDst);
    ASSERT_NE(psRadar, nullptr);
    EXPECT_EQ(psRadar->pLinePositions, nullptr);
    EXPECT_EQ(psRadar->nNumLinePositions, -1);
    EXPECT_EQ(std::memcmp(psRadar->abyLeading, psNegRadar->abyLeading, RADAR_LEADING_SIZE), 0);
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
}

}  // namespace
