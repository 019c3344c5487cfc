// A simulated AVHRR pass and its orbit model, shared by the orbit model's
// tests.
#pragma once

#include "avhrr_sim.h"
#include "lumo.h"
#include "support/model_records.h"

namespace lumo {
namespace support {

// The segment of a simulated pass and the model set up from it, with the
// state table unless asked not to.
struct AvhrrPass {
    SegmentPtr pSeg;
    LRSOrbitModel_t oModel;
    explicit AvhrrPass(const lumo::sim::AvhrrPassSpec& sSpec = lumo::sim::AvhrrPassSpec(),
                       bool bTable = true)
        : pSeg(lumo::sim::MakeAvhrrSegment(sSpec)) {
        LRSInitOrbitModel(pSeg.get(), &oModel);
        if (bTable) LRSSetupCoordinateMapping(&oModel);
    }
};

}  // namespace support
}  // namespace lumo
