#include "rf_forms.h"

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string>

#include "cli_error.h"

#ifdef LUMO_HAVE_GDAL
#include "lumo_gdal.h"
#endif

namespace lumo::cli {
namespace {

std::string ReadWholeFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    if (!in) LUMO_CLI_FAIL(path + ": cannot open file");
    std::ostringstream text;
    text << in.rdbuf();
    if (in.bad()) LUMO_CLI_FAIL(path + ": read failed");
    return text.str();
}

std::string Lower(std::string text) {
    std::transform(text.begin(), text.end(), text.begin(),
                   [](unsigned char ch) { return static_cast<char>(std::tolower(ch)); });
    return text;
}

bool LooksLikeJson(const std::string& contents) {
    const std::size_t first = contents.find_first_not_of(" \t\r\n");
    return first != std::string::npos && contents[first] == '{';
}

RFModelInput ReadBinary(const std::string& path, const std::string& contents) {
    if (contents.size() < static_cast<std::size_t>(RF_BINARY_SIZE)) {
        LUMO_CLI_FAIL(path + ": a binary block has " + std::to_string(RF_BINARY_SIZE) +
                      " bytes, the file " + std::to_string(contents.size()));
    }
    std::string block = contents.substr(0, RF_BINARY_SIZE);
    RFPtr rf(LumoBinaryToRFInfo(RF_BINARY_SIZE, reinterpret_cast<unsigned char*>(&block[0])));
    if (!rf) LUMO_CLI_FAIL(path + ": " + nova::GetLastErrorReport().osText);
    RFModelInput model;
    model.psRF = rf.get();
    model.poOwner = ShareRFRecord(std::move(rf));
    return model;
}

RFModelInput ReadJson(const std::string& path, const std::string& contents) {
    nlohmann::json document;
    try {
        document = nlohmann::json::parse(contents);
    } catch (const nlohmann::json::parse_error& e) {
        LUMO_CLI_FAIL(path + ": not valid JSON: " + e.what());
    }
    LoadedModel loaded = ReadModel(document, path);
    if (loaded.nModelCode != LUMO_CODE_RF) {
        LUMO_CLI_FAIL(path + ": holds a " + Quoted(loaded.sEnvelope.osFamily) +
                      " model, not a rational function model");
    }
    RFModelInput model;
    model.psRF = static_cast<RFInfo_t*>(loaded.poRecord.get());
    model.poOwner = loaded.poRecord;
    model.nPixels = loaded.sEnvelope.nPixels;
    model.nLines = loaded.sEnvelope.nLines;
    model.aoFields = RPCFieldsFromJson(loaded.sEnvelope, document.at("rf"));
    return model;
}

std::string BinaryBlock(RFInfo_t* psRF) {
    int nLength = 0;
    std::unique_ptr<unsigned char, nova::FreeDeleter> block(LumoRFInfoToBinary(psRF, &nLength));
    if (!block) {
        LUMO_CLI_FAIL("cannot write a binary block: " + nova::GetLastErrorReport().osText);
    }
    return std::string(reinterpret_cast<const char*>(block.get()), nLength);
}

}  // namespace

std::string RFOutputForm(const std::string& to, const std::string& outputPath) {
    if (!to.empty()) {
        std::string form = Lower(to);
        if (form != "txt" && form != "rpb" && form != "bin" && form != "json" && form != "tif") {
            LUMO_CLI_FAIL("--to " + Quoted(to) + ": must be txt, rpb, bin, json or tif");
        }
        return form;
    }
    const std::string extension = Lower(std::filesystem::path(outputPath).extension().string());
    if (extension == ".txt") return "txt";
    if (extension == ".rpb") return "rpb";
    if (extension == ".json") return "json";
    if (extension == ".bin" || extension == ".rf") return "bin";
    if (extension == ".tif" || extension == ".tiff") return "tif";
    LUMO_CLI_FAIL(outputPath + ": cannot tell the output form from the extension " +
                  Quoted(extension) + "; give --to txt, rpb, bin, json or tif");
}

RFModelInput ReadRFModelAnyForm(const std::string& path) {
    const std::string contents = ReadWholeFile(path);
    if (contents.compare(0, 8, "RFMODEL ") == 0) return ReadBinary(path, contents);
    if (LooksLikeJson(contents)) return ReadJson(path, contents);
    RFModelInput model;
    RFPtr rf(LumoRPCTextToRFInfo(contents.data(), contents.size(), LUMO_RPC_TEXT_AUTO, path.c_str(),
                                 &model.aoFields));
    model.psRF = rf.get();
    model.poOwner = ShareRFRecord(std::move(rf));
    return model;
}

std::string RFModelContents(RFInfo_t* psRF, const std::string& form, int nPixels, int nLines,
                            const std::vector<LumoRPCField>& fields) {
    if (form == "txt") return LumoRFInfoToRPCText(psRF, LUMO_RPC_TEXT_TXT, fields);
    if (form == "rpb") return LumoRFInfoToRPCText(psRF, LUMO_RPC_TEXT_RPB, fields);
    if (form == "bin") return BinaryBlock(psRF);
    if (form == "json") return RFToJson(*psRF, nPixels, nLines, fields).dump(2) + "\n";
    LUMO_CLI_FAIL("output form " + Quoted(form) + ": must be txt, rpb, bin or json");
}

void NoteDroppedRPCFields(const std::vector<LumoRPCField>& fields, const std::string& form,
                          const std::string& outputPath, const std::string& prefix,
                          std::ostream& err) {
    if (fields.empty() || (form != "bin" && form != "tif")) return;
    std::string keys;
    for (const LumoRPCField& field : fields) keys += (keys.empty() ? "" : ", ") + field.osKey;
    err << prefix << ": note: "
        << (form == "bin" ? "the binary block" : "the GeoTIFF's RPC metadata")
        << " has no room for " << keys << "; " << outputPath
        << " does not keep them (a .json, .txt or .rpb output does)\n";
}

void WriteRFModel(RFInfo_t* psRF, const std::string& form, const std::string& path, int nPixels,
                  int nLines, const std::vector<LumoRPCField>& fields) {
    if (form != "tif") {
        WriteFileReplacing(path, RFModelContents(psRF, form, nPixels, nLines, fields));
        return;
    }
#ifdef LUMO_HAVE_GDAL
    // Goes through the RPC text writer: an adjustment is folded in exactly
    // as in the text forms, or the model is refused.
    lumo::gdal::AttachRPC(path, *psRF);
#else
    LUMO_CLI_FAIL(path + ": attaching rational polynomials to a GeoTIFF needs the GDAL component");
#endif
}

}  // namespace lumo::cli
