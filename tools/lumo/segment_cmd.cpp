// `lumo segment FILE.json [--json] [-o OUT.json]`: reads an ephemeris segment
// file, reports the first problem it finds, and prints a summary or the
// complete segment.
#include <memory>
#include <string>

#include <CLI/CLI.hpp>

#include "commands.h"
#include "segment_io.h"

namespace lumo::cli {
namespace {

struct SegmentOptions {
    std::string osInput;
    std::string osOutput;
    bool bJson = false;
};

void RunSegment(const SegmentOptions& options, CommandContext& context) {
    const SegmentPtr poSeg = ReadSegmentFile(options.osInput);
    if (!options.osOutput.empty()) WriteSegmentFile(options.osOutput, *poSeg);
    if (options.bJson) {
        context.out << FormatSegmentJson(SegmentToJson(*poSeg));
    } else {
        context.out << options.osInput << ": valid ephemeris segment\n" << DescribeSegment(*poSeg);
    }
}

}  // namespace

void AddSegmentCommand(CLI::App& app, CommandContext& context) {
    auto options = std::make_shared<SegmentOptions>();
    CLI::App* command =
        app.add_subcommand("segment", "Check an ephemeris segment file and print it");
    command->add_option("segment", options->osInput, "ephemeris segment file (JSON)")->required();
    command->add_flag("--json", options->bJson,
                      "print the complete segment, every field written out, instead of a summary");
    command->add_option("-o,--output", options->osOutput,
                        "also write the complete segment to this file");
    command->callback([options, &context] { RunSegment(*options, context); });
}

}  // namespace lumo::cli
