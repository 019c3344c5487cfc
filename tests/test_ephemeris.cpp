// Ephemeris segments: deep copy, assignment and release of every sub-record
// kind, including line counts that disagree with their line arrays.
#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <memory>

#include "lumo.h"
#include "runtime.h"

namespace {

struct SegmentDeleter {
    void operator()(EphemerisSeg_t* p) const { LumoSatEphemerisFree(p); }
};
using SegmentPtr = std::unique_ptr<EphemerisSeg_t, SegmentDeleter>;

template <typename T>
T* Zeroed(int nCount = 1) {
    return static_cast<T*>(HCalloc(static_cast<std::uint64_t>(nCount), sizeof(T)));
}

// A main record with a distinct value in every field, without sub-record.
SegmentPtr MainRecord() {
    SegmentPtr poSeg(Zeroed<EphemerisSeg_t>());
    auto* pabyBytes = reinterpret_cast<unsigned char*>(poSeg.get());
    for (std::size_t i = 0; i < sizeof(EphemerisSeg_t); ++i) {
        pabyBytes[i] = static_cast<unsigned char>(i * 7 + 3);
    }
    std::strcpy(poSeg->szSensorName, "SPOT5_PAN_5");
    poSeg->dfPixelRes = 5.0;
    poSeg->nOrbitType = EPH_ORBIT_NONE;
    poSeg->ppOrbitData = nullptr;
    return poSeg;
}

void AttachSubRecord(EphemerisSeg_t* psSeg, int nKind, void* pvSub) {
    psSeg->nOrbitType = nKind;
    psSeg->ppOrbitData = Zeroed<void*>();
    *psSeg->ppOrbitData = pvSub;
}

SegmentPtr AttitudeSegment(int nLines) {
    SegmentPtr poSeg = MainRecord();
    auto* psAtt = Zeroed<AttitudeData_t>();
    psAtt->dfAttitude1 = 0.1;
    psAtt->dfAttitude2 = -0.2;
    psAtt->dfAttitude3 = 0.3;
    psAtt->nNumAttitudeLines = nLines;
    if (nLines > 0) {
        psAtt->pAttitudeLines = Zeroed<AttitudeLine_t>(nLines);
        for (int i = 0; i < nLines; ++i) psAtt->pAttitudeLines[i] = {i * 1.5, -i * 0.25};
    }
    AttachSubRecord(poSeg.get(), EPH_ORBIT_ATTITUDE, psAtt);
    return poSeg;
}

SegmentPtr RadarSegment(int nLines) {
    SegmentPtr poSeg = MainRecord();
    auto* psRadar = Zeroed<RadarData_t>();
    for (int i = 0; i < RADAR_LEADING_SIZE; ++i) psRadar->abyLeading[i] = static_cast<uint8_t>(i);
    psRadar->nNumLinePositions = nLines;
    if (nLines > 0) {
        psRadar->pLinePositions = Zeroed<RadarLine_t>(nLines);
        for (int i = 0; i < nLines; ++i) {
            psRadar->pLinePositions[i] = {800000 + i, 850000 + i, 45.0f + i, 45.1f,
                                          45.2f,      -75.0f - i, -74.9f,    -74.8f};
        }
    }
    AttachSubRecord(poSeg.get(), EPH_ORBIT_RADAR, psRadar);
    return poSeg;
}

SegmentPtr AvhrrSegment(int nLines) {
    SegmentPtr poSeg = MainRecord();
    auto* psAvhrr = Zeroed<AvhrrData_t>();
    psAvhrr->nTimeDirection = 1;
    std::strcpy(psAvhrr->szEpochYearDay, "98123");
    std::strcpy(psAvhrr->szSemiMajorAxis, "7229.5");
    std::strcpy(psAvhrr->szField26, "carried");
    psAvhrr->nNumScanLines = nLines;
    if (nLines > 0) {
        psAvhrr->pScanLines = Zeroed<AvhrrLine_t>(nLines);
        for (int i = 0; i < nLines; ++i) {
            psAvhrr->pScanLines[i].nTimeMs = 3600000 + 167 * i;
            psAvhrr->pScanLines[i].abyTimeCode[2] = static_cast<uint8_t>(i);
            psAvhrr->pScanLines[i].abyCarriedB[44] = 0xAB;
        }
    }
    AttachSubRecord(poSeg.get(), EPH_ORBIT_AVHRR, psAvhrr);
    return poSeg;
}

template <typename Sub>
Sub* SubRecord(const EphemerisSeg_t* psSeg) {
    return psSeg->ppOrbitData ? static_cast<Sub*>(*psSeg->ppOrbitData) : nullptr;
}

// Main records equal in every byte apart from the holder pointer.
void ExpectSameMainRecord(const EphemerisSeg_t& sA, const EphemerisSeg_t& sB) {
    EphemerisSeg_t sLeft;
    EphemerisSeg_t sRight;
    std::memcpy(&sLeft, &sA, sizeof(sLeft));
    std::memcpy(&sRight, &sB, sizeof(sRight));
    sLeft.ppOrbitData = nullptr;
    sRight.ppOrbitData = nullptr;
    // Byte comparison on purpose: padding and carried bytes must be copied too.
    // NOLINTNEXTLINE(bugprone-suspicious-memory-comparison)
    EXPECT_EQ(std::memcmp(&sLeft, &sRight, sizeof(sLeft)), 0);
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

TEST(EphemerisDuplicate, NoSubRecord) {
    SegmentPtr poSrc = MainRecord();
    SegmentPtr poCopy(EphemerisSegDuplicate(poSrc.get()));
    ASSERT_NE(poCopy, nullptr);
    EXPECT_NE(poCopy.get(), poSrc.get());
    ExpectSameMainRecord(*poCopy, *poSrc);
    EXPECT_EQ(poCopy->ppOrbitData, nullptr);
    EXPECT_EQ(poCopy->nOrbitType, 0);
    EXPECT_EQ(EphemerisSegDuplicate(nullptr), nullptr);
}

TEST(EphemerisDuplicate, RadarCopyOutlivesItsSource) {
    SegmentPtr poSrc = RadarSegment(3);
    const RadarData_t sExpected = *SubRecord<RadarData_t>(poSrc.get());
    RadarLine_t asExpected[3];
    std::memcpy(asExpected, sExpected.pLinePositions, sizeof(asExpected));

    SegmentPtr poCopy(EphemerisSegDuplicate(poSrc.get()));
    ASSERT_NE(poCopy->ppOrbitData, nullptr);
    EXPECT_NE(poCopy->ppOrbitData, poSrc->ppOrbitData);
    const RadarData_t* psCopy = SubRecord<RadarData_t>(poCopy.get());
    EXPECT_NE(psCopy, SubRecord<RadarData_t>(poSrc.get()));
    EXPECT_NE(psCopy->pLinePositions, sExpected.pLinePositions);
    ExpectSameMainRecord(*poCopy, *poSrc);

    poSrc.reset();  // the copy must not depend on any block of the source
    EXPECT_EQ(poCopy->nOrbitType, EPH_ORBIT_RADAR);
    ASSERT_EQ(psCopy->nNumLinePositions, 3);
    // NOLINTNEXTLINE(bugprone-suspicious-memory-comparison): bit-exact copy wanted
    EXPECT_EQ(std::memcmp(psCopy->pLinePositions, asExpected, sizeof(asExpected)), 0);
    EXPECT_EQ(std::memcmp(psCopy->abyLeading, sExpected.abyLeading, RADAR_LEADING_SIZE), 0);
}

TEST(EphemerisDuplicate, AttitudeAndAvhrrCopies) {
    SegmentPtr poAtt = AttitudeSegment(5);
    SegmentPtr poAttCopy(EphemerisSegDuplicate(poAtt.get()));
    poAtt.reset();
    const AttitudeData_t* psAtt = SubRecord<AttitudeData_t>(poAttCopy.get());
    ASSERT_NE(psAtt, nullptr);
    EXPECT_EQ(psAtt->dfAttitude2, -0.2);
    ASSERT_EQ(psAtt->nNumAttitudeLines, 5);
    EXPECT_EQ(psAtt->pAttitudeLines[4].dfValue1, 6.0);
    EXPECT_EQ(psAtt->pAttitudeLines[4].dfValue2, -1.0);

    SegmentPtr poAvhrr = AvhrrSegment(2);
    SegmentPtr poAvhrrCopy(EphemerisSegDuplicate(poAvhrr.get()));
    poAvhrr.reset();
    const AvhrrData_t* psAvhrr = SubRecord<AvhrrData_t>(poAvhrrCopy.get());
    ASSERT_NE(psAvhrr, nullptr);
    EXPECT_STREQ(psAvhrr->szEpochYearDay, "98123");
    EXPECT_STREQ(psAvhrr->szField26, "carried");
    ASSERT_EQ(psAvhrr->nNumScanLines, 2);
    EXPECT_EQ(psAvhrr->pScanLines[1].nTimeMs, 3600167);
    EXPECT_EQ(psAvhrr->pScanLines[1].abyTimeCode[2], 1);
    EXPECT_EQ(psAvhrr->pScanLines[1].abyCarriedB[44], 0xAB);

    // A scan-line count of 0 gives a sub-record without a line array.
    SegmentPtr poEmpty = AvhrrSegment(0);
    SegmentPtr poEmptyCopy(EphemerisSegDuplicate(poEmpty.get()));
    const AvhrrData_t* psEmpty = SubRecord<AvhrrData_t>(poEmptyCopy.get());
    ASSERT_NE(psEmpty, nullptr);
    EXPECT_EQ(psEmpty->pScanLines, nullptr);
    EXPECT_STREQ(psEmpty->szSemiMajorAxis, "7229.5");
}

TEST(EphemerisDuplicate, UnknownKindAndEmptyHolder) {
    // Kind 5 with a holder: the copy keeps the kind and gets no holder, and
    // releasing the source frees the holder only.
    SegmentPtr poOdd = MainRecord();
    std::unique_ptr<double, nova::FreeDeleter> poForeign(Zeroed<double>(4));
    AttachSubRecord(poOdd.get(), 5, poForeign.get());
    SegmentPtr poCopy(EphemerisSegDuplicate(poOdd.get()));
    EXPECT_EQ(poCopy->nOrbitType, 5);
    EXPECT_EQ(poCopy->ppOrbitData, nullptr);
    poOdd.reset();
    poForeign.get()[3] = 1.0;  // still owned by the test, not freed

    // A holder whose sub-record pointer is null.
    SegmentPtr poHollow = MainRecord();
    AttachSubRecord(poHollow.get(), EPH_ORBIT_RADAR, nullptr);
    SegmentPtr poHollowCopy(EphemerisSegDuplicate(poHollow.get()));
    EXPECT_EQ(poHollowCopy->ppOrbitData, nullptr);
    EXPECT_EQ(poHollowCopy->nOrbitType, EPH_ORBIT_RADAR);

    LumoSatEphemerisFree(nullptr);
}

// A count that disagrees with its array is never followed: the copy holds no
// line array and says so with a count of 0.
TEST(EphemerisDuplicate, CountDisagreeingWithArray) {
    SegmentPtr poNegative = RadarSegment(2);
    SubRecord<RadarData_t>(poNegative.get())->nNumLinePositions = -4;
    SegmentPtr poCopy(EphemerisSegDuplicate(poNegative.get()));
    const RadarData_t* psRadar = SubRecord<RadarData_t>(poCopy.get());
    ASSERT_NE(psRadar, nullptr);
    EXPECT_EQ(psRadar->pLinePositions, nullptr);
    EXPECT_EQ(psRadar->nNumLinePositions, 0);

    SegmentPtr poNullArray = AttitudeSegment(0);
    SubRecord<AttitudeData_t>(poNullArray.get())->nNumAttitudeLines = 1000000;
    SegmentPtr poAttCopy(EphemerisSegDuplicate(poNullArray.get()));
    const AttitudeData_t* psAtt = SubRecord<AttitudeData_t>(poAttCopy.get());
    ASSERT_NE(psAtt, nullptr);
    EXPECT_EQ(psAtt->pAttitudeLines, nullptr);
    EXPECT_EQ(psAtt->nNumAttitudeLines, 0);
    EXPECT_EQ(psAtt->dfAttitude3, 0.3);

    SegmentPtr poAvhrr = AvhrrSegment(0);
    SubRecord<AvhrrData_t>(poAvhrr.get())->nNumScanLines = 7;
    SegmentPtr poAvhrrCopy(EphemerisSegDuplicate(poAvhrr.get()));
    EXPECT_EQ(SubRecord<AvhrrData_t>(poAvhrrCopy.get())->pScanLines, nullptr);
    EXPECT_EQ(SubRecord<AvhrrData_t>(poAvhrrCopy.get())->nNumScanLines, 0);
}

TEST(EphemerisFreeOrbit, KeepsTheMainRecord) {
    SegmentPtr poSeg = AvhrrSegment(3);
    EphemerisSegFreeOrbit(poSeg.get());
    EXPECT_EQ(poSeg->ppOrbitData, nullptr);
    EXPECT_EQ(poSeg->nOrbitType, 0);
    EXPECT_STREQ(poSeg->szSensorName, "SPOT5_PAN_5");

    SegmentPtr poKindOnly = MainRecord();
    poKindOnly->nOrbitType = 2;
    EphemerisSegFreeOrbit(poKindOnly.get());
    EXPECT_EQ(poKindOnly->nOrbitType, 0);
    EphemerisSegFreeOrbit(nullptr);
}

TEST(EphemerisCopyInto, CreatesReplacesAndReleases) {
    EphemerisSeg_t* psDst = nullptr;
    EphemerisSeg_t* psSrc = nullptr;
    EphemerisSegCopyInto(&psDst, &psSrc);  // neither has a segment
    EXPECT_EQ(psDst, nullptr);

    SegmentPtr poSrc = AttitudeSegment(4);
    psSrc = poSrc.get();
    EphemerisSegCopyInto(&psDst, &psSrc);  // destination created
    SegmentPtr poDst(psDst);
    ASSERT_NE(psDst, nullptr);
    ExpectSameMainRecord(*psDst, *psSrc);
    EXPECT_EQ(psDst->nOrbitType, EPH_ORBIT_ATTITUDE);
    const AttitudeData_t* psAtt = SubRecord<AttitudeData_t>(psDst);
    ASSERT_NE(psAtt, nullptr);
    EXPECT_NE(psAtt, SubRecord<AttitudeData_t>(psSrc));
    ASSERT_EQ(psAtt->nNumAttitudeLines, 4);
    EXPECT_EQ(psAtt->pAttitudeLines[3].dfValue1, 4.5);

    // Replace an existing radar segment: the old sub-record is released.
    SegmentPtr poRadar = RadarSegment(6);
    EphemerisSeg_t* psRadar = poRadar.release();
    EphemerisSegCopyInto(&psRadar, &psSrc);
    poRadar.reset(psRadar);
    EXPECT_EQ(psRadar->nOrbitType, EPH_ORBIT_ATTITUDE);
    ASSERT_NE(SubRecord<AttitudeData_t>(psRadar), nullptr);
    EXPECT_EQ(SubRecord<AttitudeData_t>(psRadar)->pAttitudeLines[1].dfValue2, -0.25);

    poSrc.reset();  // the copies stand alone
    psSrc = nullptr;
    EXPECT_EQ(SubRecord<AttitudeData_t>(psDst)->pAttitudeLines[2].dfValue1, 3.0);

    // A source without a segment releases the destination's.
    psDst = poDst.release();
    EphemerisSegCopyInto(&psDst, &psSrc);
    EXPECT_EQ(psDst, nullptr);
}

TEST(EphemerisCopyInto, SubRecordWithoutLinesIsNotCopied) {
    SegmentPtr poSrc = AttitudeSegment(0);
    EphemerisSeg_t* psSrc = poSrc.get();
    SegmentPtr poDst = AvhrrSegment(2);
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
    SegmentPtr poNeg = RadarSegment(3);
    SubRecord<RadarData_t>(poNeg.get())->nNumLinePositions = -1;
    EphemerisSeg_t* psNeg = poNeg.get();
    EphemerisSegCopyInto(&psDst, &psNeg);
    const RadarData_t* psRadar = SubRecord<RadarData_t>(psDst);
    ASSERT_NE(psRadar, nullptr);
    EXPECT_EQ(psRadar->pLinePositions, nullptr);
    EXPECT_EQ(psRadar->nNumLinePositions, 0);
    EXPECT_EQ(psRadar->abyLeading[107], 107);
}

TEST(EphemerisCopyInto, SameRecordOrSharedSegmentChangesNothing) {
    SegmentPtr poSeg = RadarSegment(2);
    EphemerisSeg_t* psSeg = poSeg.get();
    void** ppHolder = psSeg->ppOrbitData;
    EphemerisSegCopyInto(&psSeg, &psSeg);
    EphemerisSeg_t* psAlias = psSeg;
    EphemerisSegCopyInto(&psAlias, &psSeg);  // two records sharing one segment
    EXPECT_EQ(psSeg->ppOrbitData, ppHolder);
    EXPECT_EQ(SubRecord<RadarData_t>(psSeg)->pLinePositions[1].nRangeFirst, 800001);
    EphemerisSegCopyInto(nullptr, &psSeg);
    EphemerisSegCopyInto(&psAlias, nullptr);
    EXPECT_EQ(psAlias, psSeg);
}

}  // namespace
