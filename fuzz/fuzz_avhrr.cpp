// libFuzzer target: AVHRR segments for the orbit model. Input that starts
// with '{' is a segment file; any other input overwrites the orbit header's
// text fields, the time direction, the first and last scan lines' time codes
// and GMT times and the acquisition date of a valid simulated pass. Either
// way the set-up must refuse a bad segment with a numbered error (or the
// file reader with a data exception), and a model that sets up must map
// points both ways with finite results or a failure status.

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "avhrr_sim.h"
#include "lumo.h"
#include "runtime.h"
#include "segment_input.h"
#include "segment_io.h"

namespace {

void Check(bool bCondition) {
    if (!bCondition) std::abort();
}

// The set-up prints its notices on standard output by design.
const bool gbQuiet = std::freopen("/dev/null", "w", stdout) != nullptr;

// Copies up to nSize bytes from the input into a field, keeping its terminator.
void Take(const std::uint8_t*& p, const std::uint8_t* pEnd, void* pTarget, std::size_t nSize) {
    const std::size_t n = std::min<std::size_t>(nSize, static_cast<std::size_t>(pEnd - p));
    std::memcpy(pTarget, p, n);
    p += n;
}

lumo::cli::SegmentPtr HeaderSegment(const std::uint8_t* p, const std::uint8_t* pEnd) {
    lumo::sim::AvhrrPassSpec sSpec;
    sSpec.nLines = 12;
    lumo::cli::SegmentPtr psSeg(lumo::sim::MakeAvhrrSegment(sSpec));
    auto& h = *static_cast<AvhrrData_t*>(*psSeg->ppOrbitData);
    char* pszFields = h.szField1;  // the 26 fields follow one another
    for (int k = 0; k < 26 && p < pEnd; ++k) {
        char* pszField = pszFields + k * AVHRR_FIELD_SIZE;
        std::memset(pszField, 0, AVHRR_FIELD_SIZE);
        Take(p, pEnd, pszField, AVHRR_FIELD_SIZE - 1);
    }
    Take(p, pEnd, &h.nTimeDirection, sizeof h.nTimeDirection);
    for (AvhrrLine_t* psLine : {&h.pScanLines[0], &h.pScanLines[sSpec.nLines - 1]}) {
        Take(p, pEnd, psLine->abyTimeCode, AVHRR_TIME_CODE_SIZE);
        Take(p, pEnd, &psLine->nTimeMs, sizeof psLine->nTimeMs);
    }
    if (p < pEnd) h.nNumScanLines = 1 + *p++ % sSpec.nLines;
    Take(p, pEnd, psSeg->szAcquisitionDate, EPH_DATE_SIZE - 1);
    return psSeg;
}

void Exercise(LRSOrbitModel_t& m) {
    LRSSetupCoordinateMapping(&m);
    for (double p : {0.5, 1024.0, 2047.5}) {
        const double l = 0.5 * m.nNumScanLines;
        double lon = 0.0, lat = 0.0, p2 = 0.0, l2 = 0.0;
        if (LRSImageToGeodetic(&m, p, l, &lon, &lat) != 1) continue;
        Check(std::isfinite(lon) && std::isfinite(lat));
        if (LRSGeodeticToImage(&m, lon, lat, 0.0, &p2, &l2) == 1) {
            Check(std::isfinite(p2) && std::isfinite(l2));
        } else {
            Check(p2 == 0.0 && l2 == -10000.0);
        }
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* pabyData, std::size_t nSize) {
    static_cast<void>(gbQuiet);
    if (nSize == 0) return 0;
    lumo::cli::SegmentPtr psSeg = pabyData[0] == '{'
                                      ? lumo::fuzz::SegmentFromBytes(pabyData, nSize)
                                      : HeaderSegment(pabyData + 1, pabyData + nSize);
    if (!psSeg) return 0;
    LRSOrbitModel_t m;
    try {
        LRSInitOrbitModel(psSeg.get(), &m);
    } catch (const nova::NumberedError&) {
        return 0;  // refused with a message: the expected outcome for bad input
    }
    Check(std::isfinite(m.dfTimeOrigin) && m.dfTimeEnd >= m.dfTimeOrigin);
    Check(m.nNumStates >= 2 && m.nNumStates <= 90000);
    try {
        Exercise(m);
    } catch (const nova::NumberedError&) {
        // Only elements the set-up accepted but the mapping cannot use may
        // end here; the model check names them.
    }
    return 0;
}
