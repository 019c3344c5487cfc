// A rational function model in any of its four file forms: RPC text (the
// "KEY: value" and the block form), the binary block and a JSON model file;
// and written into a GeoTIFF's RPC metadata.
#pragma once

#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include "rf_io.h"

namespace lumo::cli {

// A model read from any form, with the image size when the input carries one.
struct RFModelInput {
    std::shared_ptr<void> poOwner;
    RFInfo_t* psRF = nullptr;
    int nPixels = 0;
    int nLines = 0;
    std::vector<LumoRPCField> aoFields;  // fields of the RPC text beside the model
};

// Reads a model, recognising the form from the contents.
RFModelInput ReadRFModelAnyForm(const std::string& path);

// The output form ("txt", "rpb", "bin", "json" or "tif", RPC metadata of an
// existing GeoTIFF): `to` when given, else from the extension of
// `outputPath`.
std::string RFOutputForm(const std::string& to, const std::string& outputPath);

// The file contents of a model in the given form. Fails naming the form when
// the model cannot be written in it (an RPC text form and an adjustment
// that has no RPC equivalent, for instance). The RPC text `fields` go into
// every form that has room for them (not the binary block).
std::string RFModelContents(RFInfo_t* psRF, const std::string& form, int nPixels, int nLines,
                            const std::vector<LumoRPCField>& fields = {});

// Says on `err`, behind `prefix`, which RPC text fields an output of `form`
// named `outputPath` drops (the binary block and a GeoTIFF's RPC metadata
// have no room for them).
void NoteDroppedRPCFields(const std::vector<LumoRPCField>& fields, const std::string& form,
                          const std::string& outputPath, const std::string& prefix,
                          std::ostream& err);

// Writes the model to `path` in the given form: a file replaced only once
// complete, or the RPC metadata of the GeoTIFF at `path` ("tif"). The RPC
// text `fields` go where RFModelContents puts them.
void WriteRFModel(RFInfo_t* psRF, const std::string& form, const std::string& path, int nPixels,
                  int nLines, const std::vector<LumoRPCField>& fields = {});

}  // namespace lumo::cli
