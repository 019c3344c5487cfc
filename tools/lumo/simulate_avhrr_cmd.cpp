// `lumo simulate-avhrr --segment SEG.json --gcps GCP.csv [--checks CHK.csv]`:
// an AVHRR pass from mean orbital elements and a start time: its segment
// (orbit header text fields, scan-line time codes) and control and check
// points of a true pass that differs from the nominal one by a roll bias and
// an along-track error, to try the orbit model's refinement.
#include <cstdint>
#include <memory>
#include <ostream>
#include <stdexcept>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include "avhrr_sim.h"
#include "cli_error.h"
#include "commands.h"
#include "lrs_io.h"
#include "model_io.h"
#include "points_io.h"
#include "segment_io.h"

namespace lumo::cli {
namespace {

struct SimulateAvhrrOptions {
    lumo::sim::AvhrrPassSpec sPass;
    lumo::sim::AvhrrBias sBias;
    std::string osSegment;
    std::string osGcps;
    std::string osChecks;
    int nGcpColumns = 5;
    int nGcpRows = 4;
    double dfMaxHeight = 2000.0;
    std::uint32_t nSeed = 1;
};

std::string PointText(const std::vector<ControlPoint_t>& asPoints, const char* pszPrefix) {
    std::vector<lumo::sim::SimPoint> asSim;
    for (const ControlPoint_t& c : asPoints) {
        asSim.push_back({c.dfImageX, c.dfImageY, c.dfGroundX, c.dfGroundY, c.dfGroundZ});
    }
    return SimulatedPointText(asSim, pszPrefix, kLrsGeosys);
}

void RunSimulateAvhrr(const SimulateAvhrrOptions& options, CommandContext& context) {
    SegmentPtr psSegment;
    try {
        psSegment.reset(lumo::sim::MakeAvhrrSegment(options.sPass));
    } catch (const std::invalid_argument& e) {
        LUMO_CLI_FAIL(std::string("simulated pass: ") + e.what());
    }
    LRSOrbitModel_t truth;
    CheckedLrsCall("simulated pass", [&] { LRSInitOrbitModel(psSegment.get(), &truth); });
    try {
        lumo::sim::ApplyBias(options.sBias, &truth);
    } catch (const std::invalid_argument& e) {
        LUMO_CLI_FAIL(std::string("simulated pass: ") + e.what());
    }
    CheckedLrsCall("simulated pass", [&] { LRSSetupCoordinateMapping(&truth); });
    const std::vector<ControlPoint_t> asGcps = lumo::sim::SampleAvhrrPoints(
        truth, options.nGcpColumns, options.nGcpRows, 40.0, options.dfMaxHeight, options.nSeed);
    if (asGcps.empty()) {
        LUMO_CLI_FAIL(
            "simulated pass: none of its control points lies on the "
            "Earth; nothing written");
    }
    WriteSegmentFile(options.osSegment, *psSegment);
    WriteFileReplacing(options.osGcps, PointText(asGcps, "GCP"));
    std::size_t nChecks = 0;
    if (!options.osChecks.empty()) {
        const std::vector<ControlPoint_t> asChecks = lumo::sim::SampleAvhrrPoints(
            truth, 10, 10, 5.0, options.dfMaxHeight, options.nSeed + 1);
        nChecks = asChecks.size();
        WriteFileReplacing(options.osChecks, PointText(asChecks, "CHK"));
    }
    context.out << "simulated AVHRR pass: " << options.sPass.nLines << " scan lines from epoch "
                << options.sPass.nEpochYear << " day " << options.sPass.nEpochDay << " + "
                << FormatDouble(options.sPass.dfEpochSecondOfDay + options.sPass.dfStartSeconds)
                << " s; true roll bias " << FormatDouble(options.sBias.dfRollDeg)
                << " deg, along-track " << FormatDouble(options.sBias.dfAlongTrackKm) << " km\n"
                << "wrote " << options.osSegment << ", " << options.osGcps << " (" << asGcps.size()
                << " control points)";
    if (!options.osChecks.empty()) {
        context.out << ", " << options.osChecks << " (" << nChecks << " check points)";
    }
    context.out << "\n";
}

}  // namespace

void AddSimulateAvhrrCommand(CLI::App& app, CommandContext& context) {
    auto options = std::make_shared<SimulateAvhrrOptions>();
    lumo::sim::AvhrrPassSpec& s = options->sPass;
    CLI::App* command = app.add_subcommand(
        "simulate-avhrr",
        "Simulate an AVHRR pass: segment with orbit header and time codes, control points");
    command->add_option("--segment", options->osSegment, "segment file to write (JSON)")
        ->required();
    command->add_option("--gcps", options->osGcps, "control point file to write (CSV)")->required();
    command->add_option("--checks", options->osChecks, "check point file to write (CSV, 10 x 10)");
    command
        ->add_option("--grid", options->nGcpColumns, "control points across the scan (default 5)")
        ->check(CLI::Range(1, 1000));
    command
        ->add_option("--grid-lines", options->nGcpRows, "control points along the pass (default 4)")
        ->check(CLI::Range(1, 1000));
    command->add_option("--seed", options->nSeed, "seed of the control points' heights");
    command->add_option("--max-height", options->dfMaxHeight, "highest terrain height (m)")
        ->check(CLI::Range(0.0, 9000.0));
    command->add_option("--year", s.nEpochYear, "year of the element epoch (default 2004)");
    command->add_option("--day", s.nEpochDay, "day of the year of the epoch (default 167)");
    command->add_option("--second", s.dfEpochSecondOfDay, "second of the day of the epoch");
    command->add_option("--semi-major-axis", s.dfSemiMajorAxis, "mean semi-major axis (km)");
    command->add_option("--eccentricity", s.dfEccentricity, "mean eccentricity");
    command->add_option("--inclination", s.dfInclination, "mean inclination (degrees)");
    command->add_option("--node", s.dfNode, "right ascension of the ascending node (degrees)");
    command->add_option("--perigee", s.dfPerigee, "argument of perigee (degrees)");
    command->add_option("--anomaly", s.dfMeanAnomaly, "mean anomaly at the epoch (degrees)");
    command->add_option("--start", s.dfStartSeconds, "seconds from the epoch to the first line");
    command->add_option("--lines", s.nLines, "scan lines, six a second (default 2400)");
    command->add_flag("--backward", s.bBackward, "store the scan lines latest first");
    command->add_option("--clock-offset", s.dfClockOffsetMs, "clock offset of the header (ms)");
    command->add_option("--roll-bias", options->sBias.dfRollDeg,
                        "roll of the true pass against the nominal one (degrees)");
    command->add_option("--along-track-bias", options->sBias.dfAlongTrackKm,
                        "the true satellite ahead of the nominal one (km)");
    command->callback([options, &context] { RunSimulateAvhrr(*options, context); });
}

}  // namespace lumo::cli
