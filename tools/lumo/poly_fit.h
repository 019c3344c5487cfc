// The fit of a polynomial model as the regression made it. The model record
// holds raw-coordinate coefficients, which with large ground coordinates
// (UTM eastings and northings) cancel huge terms and lose digits at high
// orders; the regression's own records evaluate in centred and scaled
// coordinates and reproduce the fit exactly. Model files keep both: the
// record for hosts that read only it, the fit for lumo's own evaluation.
#pragma once

#include <memory>

#include <nlohmann/json.hpp>

#include "nova/regression.h"

namespace lumo::cli {

struct ModelEnvelope;

struct PolyFit {
    GEOInfo_t sGeoToImage;  // ground X, Y -> pixel, line
    GEOInfo_t sImageToGeo;  // pixel, line -> ground X, Y
};

// The "fit" object of a "poly" section.
nlohmann::json PolyFitToJson(const PolyFit& fit);
// The fit a "poly" section keeps, or null when it keeps none. Throws
// nova::DataException naming the file and field for anything malformed.
std::shared_ptr<const PolyFit> PolyFitFromJson(const ModelEnvelope& envelope,
                                               const nlohmann::json& section);

}  // namespace lumo::cli
