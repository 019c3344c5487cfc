// Rigorous model record: allocation, deep copy, release, and the entry points
// whose computations are not available yet.
#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "lumo_ephemeris.h"
#include "lumo_srit.h"
#include "projection.h"
#include "runtime.h"

namespace {

// Collects warnings for the life of the object and restores the sink after.
class WarningCollector {
  public:
    WarningCollector() {
        moPrevious = nova::SetErrorSink(
            [this](const nova::ErrorReport& sReport) { masReports.push_back(sReport); });
    }
    ~WarningCollector() { nova::SetErrorSink(moPrevious); }
    const std::vector<nova::ErrorReport>& Reports() const { return masReports; }

  private:
    nova::ErrorSink moPrevious;
    std::vector<nova::ErrorReport> masReports;
};

// The bytes of a record, to show that a call left it exactly as it was.
std::vector<unsigned char> RecordBytes(const SRITInfo_t* psModel) {
    std::vector<unsigned char> aby(sizeof(SRITInfo_t));
    std::memcpy(aby.data(), psModel, sizeof(SRITInfo_t));
    return aby;
}

bool AllZero(const void* pData, std::size_t nBytes) {
    const auto* pby = static_cast<const unsigned char*>(pData);
    for (std::size_t i = 0; i < nBytes; ++i) {
        if (pby[i] != 0) return false;
    }
    return true;
}

// Gives a segment an attitude table of nLines lines (value1 = i, value2 = -i).
void AttachAttitudeTable(EphemerisSeg_t* psSeg, int nLines) {
    auto* psAttitude = static_cast<AttitudeData_t*>(HCalloc(1, sizeof(AttitudeData_t)));
    psAttitude->dfAttitude1 = 0.1;
    psAttitude->nNumAttitudeLines = nLines;
    psAttitude->pAttitudeLines = static_cast<AttitudeLine_t*>(
        HCalloc(static_cast<std::uint64_t>(nLines), sizeof(AttitudeLine_t)));
    for (int i = 0; i < nLines; ++i) psAttitude->pAttitudeLines[i] = {1.0 * i, -1.0 * i};
    psSeg->ppOrbitData = static_cast<void**>(HMalloc(sizeof(void*)));
    *psSeg->ppOrbitData = psAttitude;
    psSeg->nOrbitType = EPH_ORBIT_ATTITUDE;
}

double* LineArray(int nLines, double dfScale) {
    auto* padf = static_cast<double*>(HMalloc(sizeof(double) * static_cast<std::size_t>(nLines)));
    for (int i = 0; i < nLines; ++i) padf[i] = dfScale * i;
    return padf;
}

// A record with every field set to a recognisable value, a "PLA" segment with
// a 5-line attitude table and the matching line arrays.
SRITInfo_t* FilledRecord() {
    SRITInfo_t* psModel = SRITAllocate();
    for (int i = 0; i < SRIT_NUM_COEFS; ++i) psModel->adfCoef[i] = 1.5 * i - 7.0;
    for (int i = 0; i < SRIT_NUM_AUX; ++i) psModel->anAux[i] = 10 + i;
    std::strcpy(psModel->szAuxA, "UTM 31 D000");
    std::strcpy(psModel->szAuxB, "LONG/LAT D000");
    psModel->bAux = 0xA5;
    for (int i = 0; i < SRIT_NUM_AUX_VALUES; ++i) psModel->adfAux[i] = -2.25 * (i + 1);
    std::memset(psModel->abyAuxA, 0x11, sizeof(psModel->abyAuxA));
    std::memset(psModel->abyAuxB, 0x22, sizeof(psModel->abyAuxB));
    std::memset(psModel->abyAuxC, 0x33, sizeof(psModel->abyAuxC));
    std::memset(psModel->abyAuxD, 0x44, sizeof(psModel->abyAuxD));
    std::memcpy(psModel->Sensor, "SPOT5_PAN_2_5\0\0", SRIT_SENSOR_SIZE);
    psModel->nSensor = 54;
    psModel->nModelClass = 5;
    std::strcpy(psModel->psEphemeris->szSensorName, "PLA");
    psModel->psEphemeris->dfIFOV = 1.2e-5;
    psModel->psEphemeris->nNumLines = 5;
    AttachAttitudeTable(psModel->psEphemeris, 5);
    psModel->padfLineShiftA = LineArray(5, 1.0);
    psModel->padfLineShiftB = LineArray(5, -1.0);
    EXPECT_EQ(Geosys2ProjInfo(psModel->psProjInfo, "UTM 31 D000", 0.0, 0.0, 1.0, 1.0), 0);
    return psModel;
}

// Every field of a copy of FilledRecord().
void ExpectFilledRecord(const SRITInfo_t& sModel) {
    for (int i = 0; i < SRIT_NUM_COEFS; ++i) EXPECT_EQ(sModel.adfCoef[i], 1.5 * i - 7.0);
    for (int i = 0; i < SRIT_NUM_AUX; ++i) EXPECT_EQ(sModel.anAux[i], 10 + i);
    EXPECT_STREQ(sModel.szAuxA, "UTM 31 D000");
    EXPECT_STREQ(sModel.szAuxB, "LONG/LAT D000");
    EXPECT_EQ(sModel.bAux, 0xA5);
    for (int i = 0; i < SRIT_NUM_AUX_VALUES; ++i) EXPECT_EQ(sModel.adfAux[i], -2.25 * (i + 1));
    const unsigned char abyFill[] = {0x11, 0x22, 0x33, 0x44};
    const unsigned char* apbyBlocks[] = {sModel.abyAuxA, sModel.abyAuxB, sModel.abyAuxC,
                                         sModel.abyAuxD};
    const std::size_t anSizes[] = {SRIT_AUX_BLOCK_SIZE, SRIT_AUX_BLOCK_SIZE, SRIT_AUX_BLOCK_SIZE,
                                   SRIT_AUX_BLOCK_D_SIZE};
    for (int b = 0; b < 4; ++b) {
        for (std::size_t i = 0; i < anSizes[b]; ++i) {
            ASSERT_EQ(apbyBlocks[b][i], abyFill[b]) << "block " << b << " byte " << i;
        }
    }
    EXPECT_EQ(std::string(sModel.Sensor, SRIT_SENSOR_SIZE),
              std::string("SPOT5_PAN_2_5\0\0\0", SRIT_SENSOR_SIZE));
    EXPECT_EQ(sModel.nSensor, 54);
    EXPECT_EQ(sModel.nModelClass, 5);
    ASSERT_NE(sModel.padfLineShiftA, nullptr);
    ASSERT_NE(sModel.padfLineShiftB, nullptr);
    for (int i = 0; i < 5; ++i) {
        EXPECT_EQ(sModel.padfLineShiftA[i], 1.0 * i);
        EXPECT_EQ(sModel.padfLineShiftB[i], -1.0 * i);
    }
    ASSERT_NE(sModel.psEphemeris, nullptr);
    EXPECT_STREQ(sModel.psEphemeris->szSensorName, "PLA");
    EXPECT_EQ(sModel.psEphemeris->dfIFOV, 1.2e-5);
    ASSERT_EQ(sModel.psEphemeris->nOrbitType, EPH_ORBIT_ATTITUDE);
    ASSERT_NE(sModel.psEphemeris->ppOrbitData, nullptr);
    const auto* psAttitude = static_cast<const AttitudeData_t*>(*sModel.psEphemeris->ppOrbitData);
    ASSERT_NE(psAttitude, nullptr);
    EXPECT_EQ(psAttitude->dfAttitude1, 0.1);
    ASSERT_EQ(psAttitude->nNumAttitudeLines, 5);
    EXPECT_EQ(psAttitude->pAttitudeLines[4].dfValue1, 4.0);
    EXPECT_EQ(psAttitude->pAttitudeLines[4].dfValue2, -4.0);
    ASSERT_NE(sModel.psProjInfo, nullptr);
    EXPECT_EQ(sModel.psProjInfo->nZone, 31);
    EXPECT_EQ(sModel.psProjInfo->nProjKind, NOVA_PROJ_UTM);
}

TEST(SRITRecord, AllocateGivesZeroedRecordWithEmptySegmentAndProjection) {
    SRITInfo_t* psModel = SRITAllocate();
    ASSERT_NE(psModel, nullptr);
    EXPECT_TRUE(AllZero(psModel->adfCoef, sizeof(psModel->adfCoef)));
    EXPECT_TRUE(AllZero(psModel->anAux, sizeof(psModel->anAux)));
    EXPECT_TRUE(AllZero(psModel->abyAuxD, sizeof(psModel->abyAuxD)));
    EXPECT_EQ(psModel->padfLineShiftA, nullptr);
    EXPECT_EQ(psModel->padfLineShiftB, nullptr);
    EXPECT_EQ(psModel->nSensor, 0);
    ASSERT_NE(psModel->psProjInfo, nullptr);
    EXPECT_TRUE(AllZero(psModel->psProjInfo, sizeof(ProjInfo_t)));
    ASSERT_NE(psModel->psEphemeris, nullptr);
    EXPECT_TRUE(AllZero(psModel->psEphemeris, sizeof(EphemerisSeg_t)));
    EXPECT_EQ(psModel->psEphemeris->nOrbitType, 0);
    EXPECT_EQ(psModel->psEphemeris->ppOrbitData, nullptr);
    LumoFreeSRITInfo(psModel);
    LumoFreeSRITInfo(nullptr);  // ignored
}

TEST(SRITRecord, CopyIsDeepAndOutlivesTheSource) {
    SRITInfo_t* psSource = FilledRecord();
    SRITInfo_t* psCopy = SRITAllocate();
    SRITCopy(psCopy, psSource);
    // No block is shared.
    EXPECT_NE(psCopy->padfLineShiftA, psSource->padfLineShiftA);
    EXPECT_NE(psCopy->padfLineShiftB, psSource->padfLineShiftB);
    EXPECT_NE(psCopy->psEphemeris, psSource->psEphemeris);
    EXPECT_NE(psCopy->psEphemeris->ppOrbitData, psSource->psEphemeris->ppOrbitData);
    EXPECT_NE(psCopy->psProjInfo, psSource->psProjInfo);
    LumoFreeSRITInfo(psSource);
    ExpectFilledRecord(*psCopy);

    // A destination without a projection record gets one; copying again over
    // a filled destination replaces everything without leaking.
    std::free(psCopy->psProjInfo);
    psCopy->psProjInfo = nullptr;
    SRITInfo_t* psSecond = FilledRecord();
    psSecond->adfCoef[0] = 99.0;
    SRITCopy(psCopy, psSecond);
    EXPECT_EQ(psCopy->adfCoef[0], 99.0);
    ASSERT_NE(psCopy->psProjInfo, nullptr);
    EXPECT_EQ(psCopy->psProjInfo->nZone, 31);
    LumoFreeSRITInfo(psSecond);
    LumoFreeSRITInfo(psCopy);
}

TEST(SRITRecord, CopyEdgeCases) {
    SRITInfo_t* psModel = FilledRecord();
    // Same record and null sides change nothing.
    const std::vector<unsigned char> abyBefore = RecordBytes(psModel);
    SRITCopy(psModel, psModel);
    SRITCopy(psModel, nullptr);
    SRITCopy(nullptr, psModel);
    EXPECT_EQ(RecordBytes(psModel), abyBefore);
    ExpectFilledRecord(*psModel);

    // A source whose segment has no per-line table leaves the destination's
    // line arrays null although it had some before.
    SRITInfo_t* psPlain = SRITAllocate();
    psPlain->padfLineShiftA = LineArray(3, 1.0);  // no table: not copied
    SRITCopy(psModel, psPlain);
    EXPECT_EQ(psModel->padfLineShiftA, nullptr);
    EXPECT_EQ(psModel->padfLineShiftB, nullptr);
    EXPECT_EQ(psModel->psEphemeris->nOrbitType, 0);
    EXPECT_EQ(psModel->psEphemeris->ppOrbitData, nullptr);

    // An attitude table present but only one line array: only that one.
    SRITInfo_t* psOneArray = FilledRecord();
    std::free(psOneArray->padfLineShiftB);
    psOneArray->padfLineShiftB = nullptr;
    SRITCopy(psModel, psOneArray);
    ASSERT_NE(psModel->padfLineShiftA, nullptr);
    EXPECT_EQ(psModel->padfLineShiftA[4], 4.0);
    EXPECT_EQ(psModel->padfLineShiftB, nullptr);

    // A source without segment and projection releases the destination's.
    LumoSatEphemerisFree(psPlain->psEphemeris);
    psPlain->psEphemeris = nullptr;
    std::free(psPlain->psProjInfo);
    psPlain->psProjInfo = nullptr;
    SRITCopy(psModel, psPlain);
    EXPECT_EQ(psModel->psEphemeris, nullptr);
    EXPECT_EQ(psModel->psProjInfo, nullptr);
    // A destination without a segment gets one from a source that has one.
    SRITCopy(psModel, psOneArray);
    ASSERT_NE(psModel->psEphemeris, nullptr);
    EXPECT_STREQ(psModel->psEphemeris->szSensorName, "PLA");

    LumoFreeSRITInfo(psOneArray);
    LumoFreeSRITInfo(psPlain);
    LumoFreeSRITInfo(psModel);
}

TEST(SRITRecord, FailedComputationsTouchNothing) {
    SRITInfo_t* psModel = FilledRecord();
    const std::vector<unsigned char> abyBefore = RecordBytes(psModel);
    // The caller keeps its segment when no model is computed; freeing it
    // below would fail under the sanitizer had the record adopted it.
    EphemerisSeg_t* psSegment = EphemerisSegDuplicate(psModel->psEphemeris);
    ProjInfo_t sProj{};
    ASSERT_EQ(Geosys2ProjInfo(&sProj, "UTM 31 D000", 0.0, 0.0, 1.0, 1.0), 0);
    const double adfA[] = {1.0, 2.0, 3.0}, adfB[] = {4.0, 5.0, 6.0}, adfZ[] = {0.0, 1.0, 2.0};

    WarningCollector oWarnings;
    // Too few points is a plain failure without a warning.
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
    EXPECT_TRUE(oWarnings.Reports().empty());
    // Missing identifier arrays are a fatal error naming the argument.
    try {
        fnCalculateN(3);
        ADD_FAILURE() << "no error for null identifiers";
    } catch (const nova::NumberedError& e) {
        EXPECT_EQ(e.GetCode(), 100);
        EXPECT_NE(std::string(e.what()).find("pszImageIds"), std::string::npos);
    }

    EXPECT_EQ(RecordBytes(psModel), abyBefore);
    ExpectFilledRecord(*psModel);
    LumoSatEphemerisFree(psSegment);
    LumoFreeSRITInfo(psModel);
}

}  // namespace
