// Ephemeris segments for tests: a segment of any sub-record kind with a
// random value in every field, and a comparison of two segments byte for byte
// (pointers set aside), shared by the record and the segment file tests.
#pragma once

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <random>

#include "lumo.h"
#include "runtime.h"
#include "segment_io.h"

namespace lumo {
namespace support {

template <typename T>
T* Zeroed(std::size_t nCount = 1) {
    return static_cast<T*>(HCalloc(nCount, sizeof(T)));
}

// Random values that survive a text round trip: any finite or infinite
// double (no NaN, whose payload the file does not keep), any byte.
class Filler {
  public:
    explicit Filler(unsigned nSeed) : moEngine(nSeed) {}

    double Double() {
        const std::uint64_t nBits = moEngine();
        double dfValue = 0;
        std::memcpy(&dfValue, &nBits, sizeof(dfValue));
        return std::isnan(dfValue) ? -0.0 : dfValue;
    }
    float Float() {
        const auto nBits = static_cast<std::uint32_t>(moEngine());
        float fValue = 0;
        std::memcpy(&fValue, &nBits, sizeof(fValue));
        return std::isnan(fValue) ? std::numeric_limits<float>::denorm_min() : fValue;
    }
    int32_t Int() { return static_cast<int32_t>(moEngine()); }
    uint8_t Byte() { return static_cast<uint8_t>(moEngine()); }
    // A full-length text of any non-NUL bytes.
    void Text(char* pszOut, std::size_t nSize) {
        for (std::size_t i = 0; i + 1 < nSize; ++i) {
            pszOut[i] = static_cast<char>(1 + moEngine() % 255);
        }
        pszOut[nSize - 1] = '\0';
    }
    void Bytes(uint8_t* pabyOut, std::size_t nCount) {
        for (std::size_t i = 0; i < nCount; ++i) pabyOut[i] = Byte();
    }

  private:
    std::mt19937_64 moEngine;
};

inline lumo::cli::SegmentPtr RandomMainRecord(Filler& r) {
    lumo::cli::SegmentPtr poSeg(Zeroed<EphemerisSeg_t>());
    EphemerisSeg_t& s = *poSeg;
    r.Text(s.szHeaderText1, sizeof(s.szHeaderText1));
    r.Text(s.szHeaderText2, sizeof(s.szHeaderText2));
    r.Text(s.szSensorName, sizeof(s.szSensorName));
    r.Text(s.szSensorExtra, sizeof(s.szSensorExtra));
    r.Text(s.szAcquisitionDate, sizeof(s.szAcquisitionDate));
    s.nSupplementFlag = r.Int();
    for (double* pdf :
         {&s.dfIFOV,        &s.dfViewAngle,      &s.dfCentreColumn,     &s.dfCentreLine,
          &s.dfSatVelocity, &s.dfAngularSpeed,   &s.dfOrbitSpare1,      &s.dfSatHeight,
          &s.dfInclination, &s.dfLineInterval,   &s.dfAscNodeLongitude, &s.dfPerigeeArgument,
          &s.dfOrbitSpare2, &s.dfCentreLatitude, &s.dfOrbitRadius,      &s.dfPitchAngle,
          &s.dfOrbitSpare3, &s.dfOrbitSpare4,    &s.dfPixelRes,         &s.dfLineRes,
          &s.dfAvgHeight}) {
        *pdf = r.Double();
    }
    r.Text(s.szGeosys, sizeof(s.szGeosys));
    s.bCarriedFlag = r.Byte();
    s.nCarried1 = r.Int();
    for (double& df : s.adfCarriedA) df = r.Double();
    for (double& df : s.adfCarriedB) df = r.Double();
    s.nLevelConvForm = 39;
    for (int32_t& n : s.anLevelConvParams) n = r.Int();
    for (double& df : s.adfLevelConvCoefs) df = r.Double();
    for (int32_t* pn : {&s.nBytesPerRecord, &s.nNumLines, &s.nBytesPerPixel, &s.nNumPixels,
                        &s.nPrefixBytes, &s.nSuffixBytes, &s.nCarried2}) {
        *pn = r.Int();
    }
    // Image sizes a segment can have.
    s.nNumLines = std::abs(s.nNumLines % 10000001);
    s.nNumPixels = std::abs(s.nNumPixels % 10000001);
    // Special values that must come back exactly.
    s.dfIFOV = std::numeric_limits<double>::denorm_min();
    s.dfViewAngle = -0.0;
    s.dfSatHeight = std::numeric_limits<double>::infinity();
    s.dfOrbitSpare1 = -std::numeric_limits<double>::infinity();
    s.dfOrbitRadius = std::numeric_limits<double>::max();
    s.dfCentreLatitude = 0.1;
    return poSeg;
}

inline void Attach(EphemerisSeg_t* psSeg, int nKind, void* pvSub) {
    psSeg->nOrbitType = nKind;
    psSeg->ppOrbitData = Zeroed<void*>();
    *psSeg->ppOrbitData = pvSub;
}

// Attaches an attitude record with a zero-filled per-line table of nLines
// lines to a segment that holds no sub-record; returns the record.
inline AttitudeData_t* AttachLineTable(EphemerisSeg_t* psSeg, int nLines) {
    auto* psAtt = Zeroed<AttitudeData_t>();
    psAtt->nNumAttitudeLines = nLines;
    psAtt->pAttitudeLines = Zeroed<AttitudeLine_t>(static_cast<std::size_t>(nLines));
    Attach(psSeg, EPH_ORBIT_ATTITUDE, psAtt);
    return psAtt;
}

inline lumo::cli::SegmentPtr RandomSegment(int nKind, int nLines, unsigned nSeed) {
    Filler r(nSeed);
    lumo::cli::SegmentPtr poSeg = RandomMainRecord(r);
    if (nKind == EPH_ORBIT_ATTITUDE) {
        AttitudeData_t* psAtt = AttachLineTable(poSeg.get(), nLines);
        psAtt->dfAttitude1 = r.Double();
        psAtt->dfAttitude2 = r.Double();
        psAtt->dfAttitude3 = r.Double();
        for (int i = 0; i < nLines; ++i) psAtt->pAttitudeLines[i] = {r.Double(), r.Double()};
    } else if (nKind == EPH_ORBIT_RADAR) {
        auto* psRadar = Zeroed<RadarData_t>();
        r.Bytes(psRadar->abyLeading, sizeof(psRadar->abyLeading));
        psRadar->nNumLinePositions = nLines;
        psRadar->pLinePositions = Zeroed<RadarLine_t>(nLines);
        for (int i = 0; i < nLines; ++i) {
            psRadar->pLinePositions[i] = {r.Int(),   r.Int(),   r.Float(), r.Float(),
                                          r.Float(), r.Float(), r.Float(), r.Float()};
        }
        Attach(poSeg.get(), nKind, psRadar);
    } else if (nKind == EPH_ORBIT_AVHRR) {
        auto* psAvhrr = Zeroed<AvhrrData_t>();
        r.Bytes(psAvhrr->abyLeading, sizeof(psAvhrr->abyLeading));
        psAvhrr->nTimeDirection = r.Int();
        char* pszFirst = psAvhrr->szField1;
        for (int k = 0; k < 26; ++k) r.Text(pszFirst + k * AVHRR_FIELD_SIZE, AVHRR_FIELD_SIZE);
        psAvhrr->nNumScanLines = nLines;
        psAvhrr->pScanLines = Zeroed<AvhrrLine_t>(nLines);
        for (int i = 0; i < nLines; ++i) {
            AvhrrLine_t& sLine = psAvhrr->pScanLines[i];
            sLine.nCarried = r.Int();
            sLine.nTimeMs = r.Int();
            r.Bytes(sLine.abyCarriedA, sizeof(sLine.abyCarriedA));
            r.Bytes(sLine.abyTimeCode, sizeof(sLine.abyTimeCode));
            r.Bytes(sLine.abyCarriedB, sizeof(sLine.abyCarriedB));
        }
        Attach(poSeg.get(), nKind, psAvhrr);
    }
    return poSeg;
}

inline bool SameBytes(const void* pvA, const void* pvB, std::size_t nSize) {
    return std::memcmp(pvA, pvB, nSize) == 0;
}

// Compares records byte for byte with their pointers set aside (both come
// from zero-filled blocks, so padding agrees too).
template <typename T, typename Line>
void ExpectSameSub(const void* pvA, const void* pvB, Line* T::*ppLines, int32_t T::*pnCount) {
    T sA;
    T sB;
    std::memcpy(&sA, pvA, sizeof(T));
    std::memcpy(&sB, pvB, sizeof(T));
    ASSERT_EQ(sA.*pnCount, sB.*pnCount);
    ASSERT_NE(sB.*ppLines, nullptr);
    EXPECT_TRUE(SameBytes(sA.*ppLines, sB.*ppLines, sizeof(Line) * sA.*pnCount));
    sA.*ppLines = nullptr;
    sB.*ppLines = nullptr;
    EXPECT_TRUE(SameBytes(&sA, &sB, sizeof(T)));
}

inline void ExpectSameSegment(const EphemerisSeg_t& sA, const EphemerisSeg_t& sB) {
    EphemerisSeg_t sMainA;
    EphemerisSeg_t sMainB;
    std::memcpy(&sMainA, &sA, sizeof(sMainA));
    std::memcpy(&sMainB, &sB, sizeof(sMainB));
    sMainA.ppOrbitData = nullptr;
    sMainB.ppOrbitData = nullptr;
    EXPECT_TRUE(SameBytes(&sMainA, &sMainB, sizeof(sMainA)));
    ASSERT_EQ(sA.ppOrbitData == nullptr, sB.ppOrbitData == nullptr);
    if (sA.ppOrbitData == nullptr) return;
    switch (sA.nOrbitType) {
        case EPH_ORBIT_ATTITUDE:
            ExpectSameSub(*sA.ppOrbitData, *sB.ppOrbitData, &AttitudeData_t::pAttitudeLines,
                          &AttitudeData_t::nNumAttitudeLines);
            break;
        case EPH_ORBIT_RADAR:
            ExpectSameSub(*sA.ppOrbitData, *sB.ppOrbitData, &RadarData_t::pLinePositions,
                          &RadarData_t::nNumLinePositions);
            break;
        case EPH_ORBIT_AVHRR:
            ExpectSameSub(*sA.ppOrbitData, *sB.ppOrbitData, &AvhrrData_t::pScanLines,
                          &AvhrrData_t::nNumScanLines);
            break;
        default:
            FAIL() << "unexpected kind " << sA.nOrbitType;
    }
}

template <typename Sub>
Sub* SubRecord(const EphemerisSeg_t* psSeg) {
    return psSeg->ppOrbitData ? static_cast<Sub*>(*psSeg->ppOrbitData) : nullptr;
}

}  // namespace support
}  // namespace lumo
