// libFuzzer target: RPC text in both forms from arbitrary bytes. Bad text
// must be refused with a host exception; a model that reads must write in
// both forms and read back to the same values.

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>

#include "lumo_rf.h"
#include "fuzz_support.h"
#include "runtime.h"

namespace {

using lumo::fuzz::Check;

using RecordPtr = std::unique_ptr<RFInfo_t, void (*)(RFInfo_t*)>;

bool SameModel(const RFInfo_t& a, const RFInfo_t& b) {
    const double adfA[] = {a.dfXOffset,    a.dfXScale,   a.dfYOffset,     a.dfYScale,
                           a.dfZOffset,    a.dfZScale,   a.dfPixelOffset, a.dfPixelScale,
                           a.dfLineOffset, a.dfLineScale};
    const double adfB[] = {b.dfXOffset,    b.dfXScale,   b.dfYOffset,     b.dfYScale,
                           b.dfZOffset,    b.dfZScale,   b.dfPixelOffset, b.dfPixelScale,
                           b.dfLineOffset, b.dfLineScale};
    if (std::memcmp(adfA, adfB, sizeof adfA) != 0) return false;
    const std::size_t nBytes = RF_MAX_TERMS * sizeof(double);
    return std::memcmp(a.padfPixelNum, b.padfPixelNum, nBytes) == 0 &&
           std::memcmp(a.padfPixelDen, b.padfPixelDen, nBytes) == 0 &&
           std::memcmp(a.padfLineNum, b.padfLineNum, nBytes) == 0 &&
           std::memcmp(a.padfLineDen, b.padfLineDen, nBytes) == 0;
}

void CheckRewrite(const RFInfo_t& sModel, int nForm) {
    const std::string osText = LumoRFInfoToRPCText(&sModel, nForm);
    RecordPtr psBack(LumoRPCTextToRFInfo(osText.data(), osText.size(), nForm, "rewritten"),
                     &RFDeallocate);
    Check(SameModel(sModel, *psBack));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* pabyData, std::size_t nSize) {
    const char* pszText = reinterpret_cast<const char*>(pabyData);
    RecordPtr psRF(nullptr, &RFDeallocate);
    try {
        psRF.reset(LumoRPCTextToRFInfo(pszText, nSize, LUMO_RPC_TEXT_AUTO, "fuzz"));
    } catch (const nova::DataException&) {
        return 0;
    }
    Check(psRF != nullptr);
    Check(std::strlen(psRF->pszSensor) < RF_TEXT_SIZE);
    CheckRewrite(*psRF, LUMO_RPC_TEXT_TXT);
    CheckRewrite(*psRF, LUMO_RPC_TEXT_RPB);
    return 0;
}
