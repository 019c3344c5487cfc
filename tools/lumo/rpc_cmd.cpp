// `lumo rpc IN OUT [--to txt|rpb|bin|json]`: converts a rational function
// model between the RPC text forms, the binary block and a JSON model file.
// The input form is recognised from the contents; the output form is given
// or taken from the output file's extension.
#include <algorithm>
#include <cctype>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <sstream>
#include <string>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"
#include "rf_io.h"

namespace lumo::cli {
namespace {

struct RpcOptions {
    std::string osInput;
    std::string osOutput;
    std::string osTo;
    int nPixels = -1;  // -1: from the input when it is a model file, else 0
    int nLines = -1;
};

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

// Output form from --to, or else from the output file's extension.
std::string OutputForm(const RpcOptions& options) {
    if (!options.osTo.empty()) return Lower(options.osTo);
    const std::string extension =
        Lower(std::filesystem::path(options.osOutput).extension().string());
    if (extension == ".txt") return "txt";
    if (extension == ".rpb") return "rpb";
    if (extension == ".json") return "json";
    if (extension == ".bin" || extension == ".rf") return "bin";
    LUMO_CLI_FAIL(options.osOutput + ": cannot tell the output form from the extension " +
                  Quoted(extension) + "; give --to txt, rpb, bin or json");
}

// A model read from any of the four forms, with the image size when the
// input carries one.
struct InputModel {
    std::shared_ptr<void> poOwner;
    RFInfo_t* psRF = nullptr;
    int nPixels = 0;
    int nLines = 0;
};

bool LooksLikeJson(const std::string& contents) {
    const std::size_t first = contents.find_first_not_of(" \t\r\n");
    return first != std::string::npos && contents[first] == '{';
}

InputModel ReadBinary(const std::string& path, const std::string& contents) {
    if (contents.size() < static_cast<std::size_t>(RF_BINARY_SIZE)) {
        LUMO_CLI_FAIL(path + ": a binary block has " + std::to_string(RF_BINARY_SIZE) +
                      " bytes, the file " + std::to_string(contents.size()));
    }
    std::string block = contents.substr(0, RF_BINARY_SIZE);
    RFPtr rf(LumoBinaryToRFInfo(RF_BINARY_SIZE, reinterpret_cast<unsigned char*>(&block[0])));
    if (!rf) LUMO_CLI_FAIL(path + ": " + nova::GetLastErrorReport().osText);
    InputModel model;
    model.psRF = rf.get();
    model.poOwner = ShareRFRecord(std::move(rf));
    return model;
}

InputModel ReadJson(const std::string& path, const std::string& contents) {
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
    InputModel model;
    model.psRF = static_cast<RFInfo_t*>(loaded.poRecord.get());
    model.poOwner = loaded.poRecord;
    model.nPixels = loaded.sEnvelope.nPixels;
    model.nLines = loaded.sEnvelope.nLines;
    return model;
}

InputModel ReadInput(const std::string& path) {
    const std::string contents = ReadWholeFile(path);
    if (contents.compare(0, 8, "RFMODEL ") == 0) return ReadBinary(path, contents);
    if (LooksLikeJson(contents)) return ReadJson(path, contents);
    RFPtr rf(
        LumoRPCTextToRFInfo(contents.data(), contents.size(), LUMO_RPC_TEXT_AUTO, path.c_str()));
    InputModel model;
    model.psRF = rf.get();
    model.poOwner = ShareRFRecord(std::move(rf));
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

void RunRpc(const RpcOptions& options, CommandContext& context) {
    const std::string form = OutputForm(options);
    const InputModel model = ReadInput(options.osInput);
    std::string contents;
    if (form == "txt") {
        contents = LumoRFInfoToRPCText(model.psRF, LUMO_RPC_TEXT_TXT);
    } else if (form == "rpb") {
        contents = LumoRFInfoToRPCText(model.psRF, LUMO_RPC_TEXT_RPB);
    } else if (form == "bin") {
        contents = BinaryBlock(model.psRF);
    } else if (form == "json") {
        const int nPixels = options.nPixels >= 0 ? options.nPixels : model.nPixels;
        const int nLines = options.nLines >= 0 ? options.nLines : model.nLines;
        contents = RFToJson(*model.psRF, nPixels, nLines).dump(2) + "\n";
    } else {
        LUMO_CLI_FAIL("--to " + Quoted(options.osTo) + ": must be txt, rpb, bin or json");
    }
    WriteFileReplacing(options.osOutput, contents);
    context.out << options.osInput << " -> " << options.osOutput << " (" << form << ")\n";
}

}  // namespace

void AddRpcCommand(CLI::App& app, CommandContext& context) {
    auto options = std::make_shared<RpcOptions>();
    CLI::App* command = app.add_subcommand(
        "rpc", "Convert a rational function model between RPC text, binary block and JSON");
    command->add_option("IN", options->osInput, "model: RPC text (_RPC.TXT or .RPB), block, JSON")
        ->required();
    command->add_option("OUT", options->osOutput, "file to write")->required();
    command->add_option("--to", options->osTo, "output form: txt, rpb, bin or json");
    command->add_option("--pixels", options->nPixels, "image width for a JSON model file")
        ->check(CLI::NonNegativeNumber);
    command->add_option("--lines", options->nLines, "image height for a JSON model file")
        ->check(CLI::NonNegativeNumber);
    command->callback([options, &context] { RunRpc(*options, context); });
}

}  // namespace lumo::cli
