// A rational function model in any of its four file forms: RPC text (the
// "KEY: value" and the block form), the binary block and a JSON model file.
#pragma once

#include <memory>
#include <string>

#include "rf_io.h"

namespace lumo::cli {

// A model read from any form, with the image size when the input carries one.
struct RFModelInput {
    std::shared_ptr<void> poOwner;
    RFInfo_t* psRF = nullptr;
    int nPixels = 0;
    int nLines = 0;
};

// Reads a model, recognising the form from the contents.
RFModelInput ReadRFModelAnyForm(const std::string& path);

// The output form ("txt", "rpb", "bin" or "json"): `to` when given, else
// from the extension of `outputPath`.
std::string RFOutputForm(const std::string& to, const std::string& outputPath);

// The file contents of a model in the given form. Fails naming the form when
// the model cannot be written in it (an RPC text form and an adjustment
// that has no RPC equivalent, for instance).
std::string RFModelContents(RFInfo_t* psRF, const std::string& form, int nPixels, int nLines);

}  // namespace lumo::cli
