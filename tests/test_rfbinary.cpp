// Rational function binary block: byte layout, write-read round trips, the
// older layout, and refusal of blocks that would be read past their end.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "lumo.h"
#include "nova/projection.h"
#include "nova/runtime.h"
#include "support/model_records.h"
#include "support/warnings.h"

namespace {

using RecordPtr = lumo::support::RfPtr;
using BlockPtr = std::unique_ptr<unsigned char, nova::FreeDeleter>;

// Warnings are collected, not printed.
using QuietWarnings = lumo::support::WarningCapture;

// A record with every field set to a distinct value, still a model that can
// be evaluated: each denominator is dominated by its constant term.
RecordPtr FullRecord(int nTerms) {
    RecordPtr psRF(RFAllocate(nullptr, nTerms));
    psRF->nHalfPixelShift = 0;
    psRF->nDownsample = 4;
    psRF->nExtra1 = -123456789;
    psRF->nExtra2 = 2147483647;
    double* padfFrame = &psRF->dfXOffset;  // the ten offsets and scales
    for (int k = 0; k < 10; ++k) padfFrame[k] = (k % 2 ? 1.0 : -1.0) * (k + 1) * 12.345678901;
    for (int k = 0; k < 6; ++k) {
        psRF->adfPixelAdjust[k] = 1e-3 * (k + 1);
        psRF->adfLineAdjust[k] = -2e-7 * (k + 1);
    }
    psRF->nAdjust = 1;
    for (int i = 0; i < nTerms; ++i) {
        psRF->padfPixelNum[i] = 1.0 / (i + 1);
        psRF->padfPixelDen[i] = -1.0 / (i + 3) / (i == 0 ? 1.0 : 64.0);
        psRF->padfLineNum[i] = 1e-200 * (i + 1);
        psRF->padfLineDen[i] = 3e150 / (i + 7) / (i == 0 ? 1.0 : 64.0);
    }
    std::strcpy(psRF->pszSensor, "WORLDVIEW-3");
    return psRF;
}

std::vector<unsigned char> Write(RFInfo_t* psRF) {
    int nLength = -1;
    BlockPtr pabyBlock(LumoRFInfoToBinary(psRF, &nLength));
    EXPECT_NE(pabyBlock, nullptr);
    EXPECT_EQ(nLength, RF_BINARY_SIZE);
    if (!pabyBlock) return {};
    return std::vector<unsigned char>(pabyBlock.get(), pabyBlock.get() + RF_BINARY_SIZE);
}

RecordPtr Read(std::vector<unsigned char>& block, int nLength = RF_BINARY_SIZE) {
    return RecordPtr(LumoBinaryToRFInfo(nLength, block.data()));
}

// Doubles survive to the 15 significant digits of "%22.14e".
void ExpectSameRecord(const RFInfo_t& a, const RFInfo_t& b) {
    EXPECT_EQ(lumo::support::RfDifference(a, b, 1e-14), "");
    EXPECT_EQ(a.nTerms, b.nTerms);
    EXPECT_EQ(a.nDownsample, b.nDownsample);
    EXPECT_EQ(a.nExtra1, b.nExtra1);
    EXPECT_EQ(a.nExtra2, b.nExtra2);
    EXPECT_EQ(a.nAdjust, b.nAdjust);
    EXPECT_STREQ(a.pszSensor, b.pszSensor);
    EXPECT_STREQ(a.pszGeosys, b.pszGeosys);
    for (int k = 0; k < 6; ++k) {
        EXPECT_NEAR(a.adfPixelAdjust[k], b.adfPixelAdjust[k],
                    1e-14 * std::fabs(a.adfPixelAdjust[k]));
        EXPECT_NEAR(a.adfLineAdjust[k], b.adfLineAdjust[k], 1e-14 * std::fabs(a.adfLineAdjust[k]));
    }
}

std::string Bytes(const std::vector<unsigned char>& block, int nOffset, int nCount) {
    return std::string(reinterpret_cast<const char*>(block.data()) + nOffset, nCount);
}

TEST(RFBinary, WriteThenReadReproducesEveryField) {
    QuietWarnings quiet;
    // A model without terms is written, but read back it is refused: its
    // denominators vanish everywhere.
    RecordPtr psEmpty = FullRecord(0);
    std::vector<unsigned char> empty = Write(psEmpty.get());
    EXPECT_EQ(Read(empty), nullptr);
    EXPECT_NE(nova::GetLastErrorReport().osText.find("nTerms = 0"), std::string::npos);
    for (int nTerms : {20, 7}) {
        RecordPtr psRF = FullRecord(nTerms);
        if (nTerms == 7) {  // a projection's parameters travel with the block
            std::strcpy(psRF->pszGeosys, "TM D003");
            ASSERT_EQ(Geosys2ProjInfo(psRF->psProjInfo, "TM D003", 0.0, 0.0, 1.0, 1.0), 0);
            psRF->psProjInfo->adfProjParms[2] = 9.0;
            psRF->psProjInfo->adfProjParms[4] = 0.9996;
        }
        std::vector<unsigned char> block = Write(psRF.get());
        RecordPtr psBack = Read(block);
        ASSERT_NE(psBack, nullptr);
        EXPECT_EQ(psBack->nHalfPixelShift, 0);
        ExpectSameRecord(*psRF, *psBack);
        for (int k = 0; k < NOVA_PROJ_PARMS; ++k) {
            EXPECT_EQ(psBack->psProjInfo->adfProjParms[k], psRF->psProjInfo->adfProjParms[k]) << k;
        }
        // And the block is stable: writing the read record gives it again.
        EXPECT_EQ(Write(psBack.get()), block);
    }
}

TEST(RFBinary, ByteLayoutOfTheCurrentForm) {
    RecordPtr psRF = FullRecord(20);
    psRF->nHalfPixelShift = 5;  // any non-zero value is written as "1"
    psRF->pszSensor[0] = '\0';
    std::vector<unsigned char> block = Write(psRF.get());
    EXPECT_EQ(Bytes(block, 0, 9), "RFMODEL 1");
    EXPECT_EQ(block[9], '\0');
    EXPECT_EQ(Bytes(block, 10, 12), std::string(12, ' '));
    EXPECT_EQ(Bytes(block, 22, 8), "DS  42ND");
    EXPECT_EQ(block[30], '\0');  // no sensor
    EXPECT_EQ(Bytes(block, 31, 481), std::string(481, ' '));
    EXPECT_EQ(Bytes(block, 512, 24), "  20-1234567892147483647");
    char szValue[32];
    std::snprintf(szValue, sizeof szValue, "%22.14e", psRF->dfXOffset);
    EXPECT_EQ(Bytes(block, 536, 22), szValue);
    std::snprintf(szValue, sizeof szValue, "%22.14e", psRF->adfLineAdjust[5]);
    EXPECT_EQ(Bytes(block, 536 + 21 * 22, 22), szValue);
    EXPECT_EQ(block[1020], '\0');
    EXPECT_EQ(Bytes(block, 1021, 3), "   ");
    std::snprintf(szValue, sizeof szValue, "%22.14e", psRF->padfLineDen[19]);
    EXPECT_EQ(Bytes(block, 2560 + 19 * 22, 22), szValue);
    EXPECT_EQ(block[2560 + 20 * 22], '\0');
    EXPECT_EQ(Bytes(block, 3072, 16), std::string("LON D000") + std::string(8, '\0'));
    EXPECT_EQ(block[3328], '\0');  // geographic: no projection parameters
    EXPECT_EQ(Bytes(block, 3329, 255), std::string(255, ' '));
    EXPECT_EQ(Read(block)->nHalfPixelShift, 1);
    EXPECT_STREQ(Read(block)->pszSensor, "");

    std::strcpy(psRF->pszSensor, "SPOT7");
    block = Write(psRF.get());
    EXPECT_EQ(Bytes(block, 27, 14), "2NDSENSORSPOT7");
    EXPECT_EQ(Bytes(block, 41, 2), std::string("\0 ", 2));
}

// An older-layout block written by hand: three 22-character integers and 16
// doubles, no second-order adjustment.
TEST(RFBinary, HandWrittenOlderLayoutReads) {
    std::vector<unsigned char> block(RF_BINARY_SIZE, ' ');
    const auto put = [&](int nOffset, const std::string& text) {
        std::memcpy(block.data() + nOffset, text.c_str(), text.size() + 1);
    };
    put(0, "RFMODEL 1");
    put(22, "DS  2");
    put(30, "sensor");  // marker compared without regard to case
    put(36, "IKONOS");
    char szField[80];
    std::snprintf(szField, sizeof szField, "%22d%22d%22d", 3, 17, -4);
    put(512, szField);
    const double adfValues[16] = {-105.0, 0.1,    39.5, 0.08, 1600.0, 500.0, 5000.0, 5000.0,
                                  6000.0, 6000.0, 0.25, 1e-3, 0.0,    -0.5,  0.0,    2e-3};
    for (int k = 0; k < 16; ++k) {
        std::snprintf(szField, sizeof szField, "%22.14e", adfValues[k]);
        put(578 + 22 * k, szField);
    }
    for (int i = 0; i < 3; ++i) {
        std::snprintf(szField, sizeof szField, "%22.14e", 1.5 * (i + 1));
        put(1024 + 22 * i, szField);
        put(2048 + 22 * i, szField);
        put(1536 + 22 * i, i == 0 ? "1" : "0");
        put(2560 + 22 * i, i == 0 ? "1" : "0");
    }
    put(3072, "LON D000");
    RecordPtr psRF = Read(block);
    ASSERT_NE(psRF, nullptr);
    EXPECT_EQ(psRF->nHalfPixelShift, 1);
    EXPECT_EQ(psRF->nDownsample, 2);
    EXPECT_STREQ(psRF->pszSensor, "IKONOS");
    EXPECT_EQ(psRF->nTerms, 3);
    EXPECT_EQ(psRF->nExtra2, -4);
    // The ten offsets and scales, then first-order pixel and line terms.
    const double* padfFirst = &psRF->dfXOffset;
    for (int k = 0; k < 10; ++k) EXPECT_EQ(padfFirst[k], adfValues[k]) << k;
    for (int k = 0; k < 3; ++k) {
        EXPECT_EQ(psRF->adfPixelAdjust[k], adfValues[10 + k]) << k;
        EXPECT_EQ(psRF->adfLineAdjust[k], adfValues[13 + k]) << k;
        EXPECT_EQ(psRF->adfPixelAdjust[3 + k], 0.0);
    }
    EXPECT_EQ(psRF->nAdjust, 1);
    EXPECT_EQ(psRF->padfPixelNum[2], 4.5);
    EXPECT_EQ(psRF->padfPixelDen[0], 1.0);
    EXPECT_STREQ(psRF->pszGeosys, "LON D000");
}

TEST(RFBinary, AdjustmentFlagLooksAtFirstOrderTermsOnly) {
    RecordPtr psRF = FullRecord(20);
    for (int k = 0; k < 3; ++k) psRF->adfPixelAdjust[k] = psRF->adfLineAdjust[k] = 0.0;
    std::vector<unsigned char> block = Write(psRF.get());
    RecordPtr psBack = Read(block);
    EXPECT_EQ(psBack->nAdjust, 0);
    EXPECT_NE(psBack->adfPixelAdjust[4], 0.0);  // kept, but not in force
    psRF->adfPixelAdjust[2] = 1e-9;             // the last first-order term alone
    block = Write(psRF.get());
    EXPECT_EQ(Read(block)->nAdjust, 1);
    // A NaN first-order term puts the adjustment in force, and such a model
    // cannot be evaluated.
    QuietWarnings quiet;
    psRF->adfLineAdjust[1] = std::nan("");
    block = Write(psRF.get());
    EXPECT_EQ(Read(block), nullptr);
    EXPECT_NE(nova::GetLastErrorReport().osText.find("adfLineAdjust[1] = nan"), std::string::npos);
}

TEST(RFBinary, TextsOfSixteenCharactersAndLongerOnesAreCut) {
    QuietWarnings quiet;
    RecordPtr psRF = FullRecord(20);
    // Buffers filled to their last byte with no terminator: only 16
    // characters may be taken.
    std::memset(psRF->pszSensor, 'S', RF_TEXT_SIZE);
    std::memcpy(psRF->pszGeosys, "UTM 31 U D000 XYZ", RF_TEXT_SIZE);
    std::vector<unsigned char> block = Write(psRF.get());
    EXPECT_EQ(Bytes(block, 36, 17), std::string(16, 'S') + '\0');
    EXPECT_EQ(Bytes(block, 3072, 17), "UTM 31 U D000 XY ");  // no terminator
    RecordPtr psBack = Read(block);
    EXPECT_STREQ(psBack->pszSensor, std::string(16, 'S').c_str());
    EXPECT_STREQ(psBack->pszGeosys, "UTM 31 U D000 XY");
    // A block whose sensor field runs on without a NUL is cut to 16 too.
    std::memset(block.data() + 36, 'Q', 100);
    EXPECT_STREQ(Read(block)->pszSensor, std::string(16, 'Q').c_str());
}

TEST(RFBinary, ReaderRefusesBlocksItWouldReadPastTheEndOf) {
    RecordPtr psRF = FullRecord(20);
    std::vector<unsigned char> block = Write(psRF.get());
    // Wrong or lower-case magic.
    block[0] = 'r';
    EXPECT_EQ(Read(block), nullptr);
    block[0] = 'R';
    // A length below the block size: the bytes given are all that may be read.
    std::vector<unsigned char> shortBlock(block.begin(), block.begin() + 100);
    EXPECT_EQ(Read(shortBlock, 100), nullptr);
    EXPECT_EQ(Read(block, RF_BINARY_SIZE - 1), nullptr);
    EXPECT_NE(Read(block, 0), nullptr);  // not given: the whole block is assumed
    EXPECT_NE(Read(block, 5000), nullptr);
    EXPECT_EQ(LumoBinaryToRFInfo(RF_BINARY_SIZE, nullptr), nullptr);
    // The marker is compared without regard to case (another one selects
    // the older layout, read above).
    std::memcpy(block.data() + 27, "2nd", 3);
    EXPECT_EQ(Read(block)->nExtra1, -123456789);
    // Term counts the coefficient blocks cannot hold, in both layouts.
    std::memcpy(block.data() + 512, "  21", 4);
    EXPECT_EQ(Read(block), nullptr);
    std::memcpy(block.data() + 512, "  -1", 4);
    EXPECT_EQ(Read(block), nullptr);
    block[28] = 'X';  // older layout: a 22-character count
    char szField[32];
    std::snprintf(szField, sizeof szField, "%22d", 23);
    std::memcpy(block.data() + 512, szField, 22);
    EXPECT_EQ(Read(block), nullptr);
    std::snprintf(szField, sizeof szField, "%22d", 20);
    std::memcpy(block.data() + 512, szField, 22);
    EXPECT_NE(Read(block), nullptr);
}

TEST(RFBinary, WriterRefusesFieldsItCannotHold) {
    QuietWarnings quiet;
    RecordPtr psRF(RFAllocate(nullptr, 25));
    int nLength = -1;
    EXPECT_EQ(LumoRFInfoToBinary(psRF.get(), &nLength), nullptr);
    EXPECT_EQ(nLength, 0);
    EXPECT_NE(nova::GetLastErrorReport().osText.find("nTerms"), std::string::npos);
    psRF->nTerms = 20;
    psRF->nDownsample = 1000;  // "%3d" has no room
    EXPECT_EQ(LumoRFInfoToBinary(psRF.get(), &nLength), nullptr);
    psRF->nDownsample = 1;
    psRF->nExtra2 = -2147483647 - 1;  // "%10d" has no room
    EXPECT_EQ(LumoRFInfoToBinary(psRF.get(), &nLength), nullptr);
    psRF->nExtra2 = 0;
    EXPECT_EQ(LumoRFInfoToBinary(nullptr, &nLength), nullptr);
    EXPECT_FALSE(Write(psRF.get()).empty());
}

}  // namespace
