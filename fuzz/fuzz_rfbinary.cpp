// libFuzzer target: rational function binary blocks from arbitrary bytes.
// The raw input is offered with its true length (a short block must be
// refused without a read past its end); the input padded to a full block
// with the magic in front must read, write back and read again to the same
// block, and the transforms must run on whatever record comes out.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <vector>

#include "lumo_rf.h"
#include "fuzz_support.h"
#include "runtime.h"

namespace {

using lumo::fuzz::Check;

using RecordPtr = std::unique_ptr<RFInfo_t, void (*)(RFInfo_t*)>;
using BlockPtr = std::unique_ptr<unsigned char, nova::FreeDeleter>;

RecordPtr Read(int nLength, unsigned char* pabyBlock) {
    return RecordPtr(LumoBinaryToRFInfo(nLength, pabyBlock), &RFDeallocate);
}

void ExerciseTransforms(RFInfo_t* psRF) {
    double dfPixel = 0.0, dfLine = 0.0;
    RFGeo2Img(psRF, psRF->dfXOffset, psRF->dfYOffset, psRF->dfZOffset, &dfPixel, &dfLine);
    double dfX = LUMO_NULL_VALUE, dfY = LUMO_NULL_VALUE, dfZ = LUMO_NULL_VALUE;
    RFImg2Geo(psRF, psRF->dfPixelOffset, psRF->dfLineOffset, &dfX, &dfY, &dfZ);
}

void CheckStableRoundTrip(RFInfo_t* psRF) {
    int nLength = 0;
    BlockPtr pabyFirst(LumoRFInfoToBinary(psRF, &nLength));
    if (!pabyFirst) return;  // a field the block cannot hold, refused with a warning
    Check(nLength == RF_BINARY_SIZE);
    RecordPtr psAgain = Read(nLength, pabyFirst.get());
    Check(psAgain != nullptr);
    Check(psAgain->nTerms == psRF->nTerms);
    int nSecondLength = 0;
    BlockPtr pabySecond(LumoRFInfoToBinary(psAgain.get(), &nSecondLength));
    Check(pabySecond != nullptr);
    Check(std::memcmp(pabyFirst.get(), pabySecond.get(), RF_BINARY_SIZE) == 0);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* pabyData, std::size_t nSize) {
    lumo::fuzz::SilenceWarnings();
    if (nSize > 0 && nSize < static_cast<std::size_t>(RF_BINARY_SIZE)) {
        std::vector<unsigned char> abyExact(pabyData, pabyData + nSize);
        Check(Read(static_cast<int>(nSize), abyExact.data()) == nullptr);
    }
    std::vector<unsigned char> abyBlock(RF_BINARY_SIZE, ' ');
    std::memcpy(abyBlock.data(), pabyData, std::min<std::size_t>(nSize, RF_BINARY_SIZE));
    std::memcpy(abyBlock.data(), "RFMODEL ", 8);
    RecordPtr psRF = Read(RF_BINARY_SIZE, abyBlock.data());
    if (!psRF) return 0;
    Check(psRF->nTerms >= 0 && psRF->nTerms <= RF_MAX_TERMS);
    Check(std::strlen(psRF->pszSensor) < RF_TEXT_SIZE);
    Check(std::strlen(psRF->pszGeosys) < RF_TEXT_SIZE);
    ExerciseTransforms(psRF.get());
    CheckStableRoundTrip(psRF.get());
    return 0;
}
