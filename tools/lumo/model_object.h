// Math model objects for models read from files: the one interface through
// which orthorectification and rational polynomial fitting use any family.
#pragma once

#include <memory>

#include "lumo.h"
#include "model_io.h"

namespace lumo::cli {

// A new object over the model: the model object LumoMathModel for the
// families it wraps, a record model for the others. Throws naming the file
// when its family has no object yet.
std::unique_ptr<nova::mathmodel::IMathModel> MakeModelObject(const LoadedModel& model);

// An object over a rational function record with ground coordinates in
// longitude and latitude and heights above the ellipsoid, as image metadata
// gives them.
std::unique_ptr<nova::mathmodel::IMathModel> MakeRpcModelObject(std::shared_ptr<void> poRecord,
                                                                int nPixels, int nLines);

}  // namespace lumo::cli
