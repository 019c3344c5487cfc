// Rigorous model record: allocation, deep copy, release, and failed
// computations that leave the record and the caller's segment alone.
#include <gtest/gtest.h>

#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "lumo_ephemeris.h"
#include "lumo_srit.h"
#include "projection.h"
#include "runtime.h"
#include "support/numbered_error.h"
#include "support/segments.h"

namespace {

// The record's value fields, from adfCoef to the last carried block.
constexpr std::size_t kValueBytes = offsetof(SRITInfo_t, padfLineShiftB);

std::vector<unsigned char> Bytes(const void* pv, std::size_t n) {
    const auto* p = static_cast<const unsigned char*>(pv);
    return std::vector<unsigned char>(p, p + n);
}

double* LineArray(int nLines, double dfScale) {
    auto* padf = static_cast<double*>(HMalloc(sizeof(double) * static_cast<std::size_t>(nLines)));
    for (int i = 0; i < nLines; ++i) padf[i] = dfScale * i;
    return padf;
}

// A record with every value field set (a byte pattern), a "PLA" segment with
// a 5-line attitude table, the matching line arrays and a UTM projection.
SRITInfo_t* FilledRecord() {
    SRITInfo_t* psModel = SRITAllocate();
    auto* pby = reinterpret_cast<unsigned char*>(psModel);
    for (std::size_t i = 0; i < kValueBytes; ++i) pby[i] = static_cast<unsigned char>(i * 7 + 1);
    // The alignment gap after bAux is no field: it stays zero.
    for (std::size_t i = offsetof(SRITInfo_t, bAux) + 1; i < offsetof(SRITInfo_t, adfAux); ++i) {
        pby[i] = 0;
    }
    std::memcpy(psModel->Sensor, "SPOT5_PAN_2_5\0\0", SRIT_SENSOR_SIZE);
    psModel->nSensor = 54;
    psModel->nModelClass = 5;
    std::strcpy(psModel->psEphemeris->szSensorName, "PLA");
    AttitudeData_t* psAttitude = lumo::support::AttachLineTable(psModel->psEphemeris, 5);
    for (int i = 0; i < 5; ++i) psAttitude->pAttitudeLines[i] = {1.0 * i, -1.0 * i};
    psModel->padfLineShiftA = LineArray(5, 1.0);
    psModel->padfLineShiftB = LineArray(5, -1.0);
    EXPECT_EQ(Geosys2ProjInfo(psModel->psProjInfo, "UTM 31 D000", 0.0, 0.0, 1.0, 1.0), 0);
    return psModel;
}

// The copy holds the same values in blocks of its own.
void ExpectSameRecord(const SRITInfo_t& a, const SRITInfo_t& b) {
    EXPECT_EQ(Bytes(&a, kValueBytes), Bytes(&b, kValueBytes));
    // Sensor, nSensor and nModelClass, which lie between the line arrays and the segment.
    constexpr std::size_t kSensorBytes =
        offsetof(SRITInfo_t, psEphemeris) - offsetof(SRITInfo_t, Sensor);
    EXPECT_EQ(Bytes(a.Sensor, kSensorBytes), Bytes(b.Sensor, kSensorBytes));
    ASSERT_NE(a.padfLineShiftA, nullptr);
    EXPECT_NE(a.padfLineShiftA, b.padfLineShiftA);
    EXPECT_EQ(Bytes(a.padfLineShiftA, 5 * sizeof(double)),
              Bytes(b.padfLineShiftA, 5 * sizeof(double)));
    EXPECT_NE(a.psEphemeris, b.psEphemeris);
    EXPECT_NE(a.psEphemeris->ppOrbitData, b.psEphemeris->ppOrbitData);
    lumo::support::ExpectSameSegment(*a.psEphemeris, *b.psEphemeris);
    EXPECT_NE(a.psProjInfo, b.psProjInfo);
    EXPECT_EQ(Bytes(a.psProjInfo, sizeof(ProjInfo_t)), Bytes(b.psProjInfo, sizeof(ProjInfo_t)));
}

TEST(SRITRecord, CopyIsDeepOutlivesTheSourceAndHandlesMissingParts) {
    SRITInfo_t* psSource = FilledRecord();
    SRITInfo_t* psCopy = SRITAllocate();
    std::free(psCopy->psProjInfo);  // a destination without projection gets one
    psCopy->psProjInfo = nullptr;
    SRITCopy(psCopy, psSource);
    ExpectSameRecord(*psCopy, *psSource);
    SRITInfo_t* psKeep = FilledRecord();
    LumoFreeSRITInfo(psSource);
    ExpectSameRecord(*psCopy, *psKeep);

    // Same record and null sides change nothing.
    const std::vector<unsigned char> abyBefore = Bytes(psCopy, sizeof(SRITInfo_t));
    SRITCopy(psCopy, psCopy);
    SRITCopy(psCopy, nullptr);
    SRITCopy(nullptr, psCopy);
    EXPECT_EQ(Bytes(psCopy, sizeof(SRITInfo_t)), abyBefore);

    // A source without per-line table leaves the line arrays null; one
    // without segment and projection releases the destination's.
    SRITInfo_t* psPlain = SRITAllocate();
    psPlain->padfLineShiftA = LineArray(3, 1.0);
    SRITCopy(psCopy, psPlain);
    EXPECT_EQ(psCopy->padfLineShiftA, nullptr);
    EXPECT_EQ(psCopy->psEphemeris->ppOrbitData, nullptr);
    LumoSatEphemerisFree(psPlain->psEphemeris);
    psPlain->psEphemeris = nullptr;
    std::free(psPlain->psProjInfo);
    psPlain->psProjInfo = nullptr;
    SRITCopy(psCopy, psPlain);
    EXPECT_EQ(psCopy->psEphemeris, nullptr);
    EXPECT_EQ(psCopy->psProjInfo, nullptr);
    // A destination without segment gets one; a single line array is copied alone.
    std::free(psKeep->padfLineShiftB);
    psKeep->padfLineShiftB = nullptr;
    SRITCopy(psCopy, psKeep);
    ASSERT_NE(psCopy->psEphemeris, nullptr);
    EXPECT_EQ(psCopy->padfLineShiftA[4], 4.0);
    EXPECT_EQ(psCopy->padfLineShiftB, nullptr);
    LumoFreeSRITInfo(psPlain);
    LumoFreeSRITInfo(psKeep);
    LumoFreeSRITInfo(psCopy);
}

TEST(SRITRecord, FailedComputationsTouchNothing) {
    SRITInfo_t* psModel = FilledRecord();
    const std::vector<unsigned char> abyBefore = Bytes(psModel, sizeof(SRITInfo_t));
    // The caller keeps its segment when no model is computed; freeing it
    // below would fail under the sanitizer had the record adopted it.
    EphemerisSeg_t* psSegment = EphemerisSegDuplicate(psModel->psEphemeris);
    ProjInfo_t sProj{};
    ASSERT_EQ(Geosys2ProjInfo(&sProj, "UTM 31 D000", 0.0, 0.0, 1.0, 1.0), 0);
    const double adfA[] = {1.0, 2.0, 3.0}, adfB[] = {4.0, 5.0, 6.0}, adfZ[] = {0.0, 1.0, 2.0};
    EXPECT_EQ(SRITCalculate(psModel, true, psSegment, 2, &sProj, adfA, adfB, adfZ, adfA, adfB), 0);
    EXPECT_EQ(SRITCalculate(psModel, false, psSegment, -1, &sProj, adfA, adfB, adfZ, adfA, adfB),
              0);
    const auto fnCalculateN = [&](int nGCP) {
        return SRITCalculateN(1, nullptr, &psModel, true, &psSegment, &sProj, nGCP, nullptr,
                              nullptr, nullptr, adfA, adfB, adfZ, nullptr, nullptr, nullptr, adfA,
                              adfB, nullptr, nullptr, 0, nullptr, nullptr, nullptr, nullptr,
                              nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr,
                              nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr,
                              nullptr, nullptr, nullptr, nullptr);
    };
    EXPECT_EQ(fnCalculateN(2), 0);
    // Missing identifier arrays are a fatal error naming the argument.
    const auto sError = lumo::support::FatalOf([&] { fnCalculateN(3); });
    EXPECT_EQ(sError.first, 100);
    EXPECT_NE(sError.second.find("pszImageIds"), std::string::npos);
    EXPECT_EQ(Bytes(psModel, sizeof(SRITInfo_t)), abyBefore);
    LumoSatEphemerisFree(psSegment);
    LumoFreeSRITInfo(psModel);
}

}  // namespace
