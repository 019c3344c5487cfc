// libFuzzer target: model files of one family (LUMO_FUZZ_FAMILY) from
// arbitrary bytes; every JSON object is read as that family. Bad documents
// must be refused with a host data exception. A model that reads must
// evaluate without a crash, only report positions that are real, keep its
// inverse honest where the family has an iterative one, and write a document
// that reads back and writes the same text again.

#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>

#include <nlohmann/json.hpp>

#include "ap_io.h"
#include "fuzz_support.h"
#include "lrs_io.h"
#include "lumo.h"
#include "model_io.h"
#include "rf_io.h"
#include "rtcs_io.h"
#include "runtime.h"
#include "srit_io.h"
#include "tps_io.h"

#ifndef LUMO_FUZZ_FAMILY
#error "LUMO_FUZZ_FAMILY names the model family this target reads"
#endif

namespace {

using lumo::cli::LoadedModel;
using nlohmann::json;

using lumo::fuzz::Check;

bool IsPosition(double a, double b) {
    return std::isfinite(a) && std::isfinite(b) && a != LUMO_NULL_VALUE && b != LUMO_NULL_VALUE;
}

json WriteModel(const LoadedModel& model) {
    void* record = model.poRecord.get();
    const int nPixels = model.sEnvelope.nPixels, nLines = model.sEnvelope.nLines;
    switch (model.nModelCode) {
        case LUMO_CODE_POLY:
            return lumo::cli::PolyToJson(*static_cast<POLYInfo_t*>(record));
        case LUMO_CODE_RF:
            return lumo::cli::RFToJson(*static_cast<RFInfo_t*>(record), nPixels, nLines);
        case LUMO_CODE_TPS:
            return lumo::cli::TpsToJson(*static_cast<TPSMInfo_t*>(record));
        case LUMO_CODE_AP:
            return lumo::cli::ApToJson(*static_cast<APInfo_t*>(record), nPixels, nLines);
        case LUMO_CODE_LRS:
            return lumo::cli::LrsToJson(*static_cast<LRSOrbitModel_t*>(record));
        case LUMO_CODE_RTCS:
            return lumo::cli::RtcsToJson(*static_cast<RTCSInfo_t*>(record));
        default:
            return lumo::cli::SritToJson(*static_cast<SRITInfo_t*>(record));
    }
}

// An image-to-ground answer of a rational function model without an
// image-space adjustment maps back onto its image point within the tolerance
// (the adjustment's inverse is approximate by design).
void CheckRoundTrip(const LoadedModel& model, double dfPixel, double dfLine, double dfX, double dfY,
                    double dfZ) {
    if (model.nModelCode != LUMO_CODE_RF) return;
    const auto* psRF = static_cast<const RFInfo_t*>(model.poRecord.get());
    if (psRF->nAdjust != 0) return;
    double p = 0.0, l = 0.0;
    Check(GenGeo2Img(model.nModelCode, model.poRecord.get(), dfX, dfY, dfZ, &p, &l) == 1);
    Check(std::fabs(p - dfPixel) <= 2e-3 && std::fabs(l - dfLine) <= 2e-3);
}

void Evaluate(const LoadedModel& model) {
    const double w = model.sEnvelope.nPixels, h = model.sEnvelope.nLines;
    const double afFractions[] = {0.5, 0.0, 1.0, -3.0, 40.0};
    const double adfHeights[] = {0.0, 1500.0, -400.0, 1e9};
    for (double fp : afFractions) {
        for (double fl : afFractions) {
            for (double z : adfHeights) {
                double x = 0.0, y = 0.0, p = 0.0, l = 0.0;
                const double dfPixel = fp * w, dfLine = fl * h;
                if (GenImg2Geo(model.nModelCode, model.poRecord.get(), dfPixel, dfLine, z, &x,
                               &y) == 1) {
                    Check(IsPosition(x, y));
                    CheckRoundTrip(model, dfPixel, dfLine, x, y, z);
                }
                if (GenGeo2Img(model.nModelCode, model.poRecord.get(), dfPixel, dfLine, z, &p,
                               &l) == 1) {
                    Check(IsPosition(p, l));
                }
            }
        }
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* pabyData, std::size_t nSize) {
    lumo::fuzz::SilenceWarnings();
    json document = json::parse(pabyData, pabyData + nSize, nullptr, /*allow_exceptions=*/false);
    if (document.is_discarded() || !document.is_object()) return 0;
    document["family"] = LUMO_FUZZ_FAMILY;
    LoadedModel model;
    try {
        model = lumo::cli::ReadModel(document, "fuzz");
    } catch (const nova::DataException&) {
        return 0;  // refused with a message: the expected outcome for bad input
    }
    Evaluate(model);
    json written;
    try {
        written = WriteModel(model);
    } catch (const nova::DataException&) {
        return 0;  // a value the file cannot hold, refused with a message
    }
    const LoadedModel back = lumo::cli::ReadModel(written, "rewritten");
    Check(WriteModel(back).dump() == written.dump());
    return 0;
}
