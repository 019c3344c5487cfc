// libFuzzer target: radar models from radar segment files of arbitrary
// bytes. A segment the radar model cannot use must be refused with a host
// error or data exception; a model that is generated must answer every
// transform with a finite position or the failure values, never a crash, an
// out-of-bounds read or a NaN.

#include <cmath>
#include <cstddef>
#include <cstdint>
#include <memory>

#include "fuzz_support.h"
#include "lumo.h"
#include "runtime.h"
#include "segment_input.h"
#include "segment_io.h"

namespace {

// Larger scenes only cost time: generation scales with the line count.
constexpr int kMaxLines = 64;

using lumo::fuzz::Check;

struct ModelDeleter {
    void operator()(RTCSInfo_t* p) const { RTCSFreeModel(p); }
};

// A transform either succeeds with a real position or fails with -1e20.
void CheckAnswer(int nResult, double a, double b) {
    if (nResult == 1) {
        Check(std::isfinite(a) && std::isfinite(b));
    } else {
        Check(nResult == 0 && a == LUMO_NULL_VALUE && b == LUMO_NULL_VALUE);
    }
}

void Exercise(const RTCSInfo_t* psModel, const EphemerisSeg_t& s) {
    const double adfPixel[] = {-1e9,
                               -5.0,
                               0.0,
                               0.5,
                               s.nNumPixels * 0.5,
                               s.nNumPixels - 1.0,
                               static_cast<double>(s.nNumPixels),
                               1e9,
                               std::nan("")};
    const double adfLine[] = {-3.0,
                              0.0,
                              s.nNumLines * 0.5,
                              s.nNumLines - 0.25,
                              static_cast<double>(s.nNumLines),
                              s.nNumLines + 0.5,
                              1e12};
    for (double p : adfPixel) {
        for (double l : adfLine) {
            for (double h : {0.0, 3000.0, -1e20}) {
                double x = 0, y = 0, p2 = 0, l2 = 0;
                const int nInverse = RTCSImg2Geo(psModel, p, l, h, &x, &y);
                CheckAnswer(nInverse, x, y);
                if (nInverse == 1) {
                    CheckAnswer(RTCSGeo2Img(psModel, x, y, h, &p2, &l2), p2, l2);
                }
                double lon = 0, lat = 0;
                if (RTCSCalGeodetic(psModel, p, l, h, &lon, &lat) == 1) {
                    Check(std::isfinite(lon) && std::isfinite(lat));
                }
            }
        }
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* pabyData, std::size_t nSize) {
    lumo::fuzz::SilenceWarnings();
    const lumo::cli::SegmentPtr psSegment = lumo::fuzz::SegmentFromBytes(pabyData, nSize);
    if (psSegment == nullptr || psSegment->nNumLines > kMaxLines) return 0;
    ProjInfo_t sProj{};
    Geosys2ProjInfo(&sProj, "LONG/LAT D000", 0.0, 0.0, 1.0, 1.0);
    std::unique_ptr<RTCSInfo_t, ModelDeleter> psModel;
    try {
        psModel.reset(RTCSGenModel(psSegment.get(), sProj, "E", {}));
    } catch (const nova::Exception&) {
        return 0;  // refused with a message
    }
    Check(psModel != nullptr);
    Exercise(psModel.get(), *psSegment);
    return 0;
}
