// `lumo rpc IN OUT [--to txt|rpb|bin|json]`: converts a rational function
// model between the RPC text forms, the binary block and a JSON model file.
// The input form is recognised from the contents; the output form is given
// or taken from the output file's extension.
#include <memory>
#include <string>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"
#include "rf_forms.h"

namespace lumo::cli {
namespace {

struct RpcOptions {
    std::string osInput;
    std::string osOutput;
    std::string osTo;
    int nPixels = -1;  // -1: from the input when it is a model file, else 0
    int nLines = -1;
};

void RunRpc(const RpcOptions& options, CommandContext& context) {
    const std::string form = RFOutputForm(options.osTo, options.osOutput);
    const RFModelInput model = ReadRFModelAnyForm(options.osInput);
    const int nPixels = options.nPixels >= 0 ? options.nPixels : model.nPixels;
    const int nLines = options.nLines >= 0 ? options.nLines : model.nLines;
    WriteFileReplacing(options.osOutput,
                       RFModelContents(model.psRF, form, nPixels, nLines, model.aoFields));
    NoteDroppedRPCFields(model.aoFields, form, options.osOutput, "lumo rpc", context.err);
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
