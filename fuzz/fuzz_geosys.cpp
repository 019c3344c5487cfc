// libFuzzer target: georeferencing texts and parameter texts from arbitrary
// bytes. Checks that parsing never overflows, that normalised texts fit their
// buffer and are stable, and that parameter texts round-trip exactly.

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

#include "projection.h"
#include "fuzz_support.h"
#include "runtime.h"

namespace {

using lumo::fuzz::Check;

void FuzzGeosys(const std::string& osText) {
    char szOut[20];
    const int nKind = DecodeGeosys(osText.c_str(), szOut);
    Check(std::strlen(szOut) < sizeof(szOut));
    if (nKind == NOVA_PROJ_UNKNOWN) {
        Check(szOut[0] == '\0');
    } else {
        char szAgain[20];
        Check(DecodeGeosys(szOut, szAgain) == nKind);  // normalising is idempotent
        Check(std::strcmp(szOut, szAgain) == 0);
    }
    ProjInfo_t sInfo;
    InitProjInfo(&sInfo, 0);
    if (Geosys2ProjInfo(&sInfo, osText.c_str(), 0.0, 0.0, 1.0, 1.0) == 0) {
        Check(std::strcmp(sInfo.szProj, szOut) == 0);
        char szModel[16];
        GetEarthModel(&sInfo, szModel);
        (void)IsConformal(sInfo.szProj);
        int nIndex = 0;
        double a = 0.0, b = 0.0;
        (void)GetEllipsoidData(sInfo.szProj, &nIndex, &a, &b);
    }
}

void FuzzParms(const std::string& osText) {
    ProjInfo_t sInfo;
    InitProjInfo(&sInfo, 0);
    if (ProjParms2Info(osText.c_str(), &sInfo) != 0) return;
    char* pszParms = ProjInfo2Parms(&sInfo);
    Check(std::strlen(pszParms) <= 255);
    ProjInfo_t sCopy = sInfo;
    std::memset(sCopy.adfProjParms, 0x55, sizeof(sCopy.adfProjParms));
    Check(ProjParms2Info(pszParms, &sCopy) == 0);
    Check(std::memcmp(sCopy.adfProjParms, sInfo.adfProjParms, sizeof(sInfo.adfProjParms)) == 0);
    std::free(pszParms);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* pabyData, std::size_t nSize) {
    lumo::fuzz::SilenceWarnings();
    // The first byte picks the parser; the rest is the text.
    if (nSize == 0) return 0;
    const std::string osText(reinterpret_cast<const char*>(pabyData + 1), nSize - 1);
    const std::string osTerminated = osText.c_str();  // up to the first NUL
    if (pabyData[0] & 1) {
        FuzzParms(osTerminated);
    } else {
        FuzzGeosys(osTerminated);
    }
    return 0;
}
