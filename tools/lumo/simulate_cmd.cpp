// `lumo simulate [--radar] --segment SEG.json --gcps GCP.csv [--checks CHK.csv]
// ...`: a simulated push-broom (or, with --radar, zero-Doppler radar) scene:
// its ephemeris segment, control points with exact image coordinates
// (optionally with noise) and independent check points, to try the rigorous
// (or radar) model.
#include <cstdint>
#include <cstdio>
#include <fstream>
#include <memory>
#include <ostream>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"
#include "lumo_sim.h"
#include "model_io.h"
#include "points_io.h"
#include "progress.h"
#include "radar_sim.h"
#include "segment_io.h"

namespace lumo::cli {
namespace {

struct SimulateOptions {
    lumo::sim::SceneParams sScene;
    lumo::sim::RadarSceneParams sRadar;
    bool bRadar = false;
    bool bAscending = false;
    bool bLeftLooking = false;
    bool bFarRangeFirst = false;
    // Options shared by both kinds that the radar scene takes when given.
    CLI::Option* poLat = nullptr;
    CLI::Option* poLon = nullptr;
    CLI::Option* poPixels = nullptr;
    CLI::Option* poLines = nullptr;
    CLI::Option* poSensor = nullptr;
    std::string osSegment;
    std::string osGcps;
    std::string osChecks;
    int nGcps = 10;
    int nChecks = 100;
    std::uint32_t nSeed = 1;
    double dfNoise = 0.0;
    double dfMinHeight = 0.0;
    double dfMaxHeight = 2000.0;
};

std::string Degrees(double value) {
    char text[32];
    std::snprintf(text, sizeof text, "%.2f", value);
    return text;
}

// A scene's control points (3 % margin, with the noise asked for) and, when a
// check file is asked for, its independent check points (1 % margin).
template <class SceneT>
void SamplePointSets(const SceneT& oScene, const SimulateOptions& options,
                     std::vector<lumo::sim::SimPoint>* pasGcps,
                     std::vector<lumo::sim::SimPoint>* pasChecks) {
    *pasGcps = oScene.SamplePoints(options.nGcps, options.nSeed, options.dfMinHeight,
                                   options.dfMaxHeight, 0.03);
    lumo::sim::AddImageNoise(pasGcps, options.dfNoise, options.nSeed + 1);
    if (!options.osChecks.empty()) {
        *pasChecks = oScene.SamplePoints(options.nChecks, options.nSeed + 2, options.dfMinHeight,
                                         options.dfMaxHeight, 0.01);
    }
}

// The radar scene: segment, control points and check points with longitude,
// latitude and height above the ellipsoid.
void RunSimulateRadar(SimulateOptions options, CommandContext& context) {
    lumo::sim::RadarSceneParams& r = options.sRadar;
    const lumo::sim::SceneParams& s = options.sScene;
    if (options.poLat->count() > 0) r.dfCentreLatDeg = s.dfNadirLatitudeDeg;
    if (options.poLon->count() > 0) r.dfCentreLonDeg = s.dfNadirLongitudeDeg;
    if (options.poPixels->count() > 0) r.nPixels = s.nPixels;
    if (options.poLines->count() > 0) r.nLines = s.nLines;
    if (options.poSensor->count() > 0) r.osSensorName = s.osSensorName;
    r.bAscending = options.bAscending;
    r.bRightLooking = !options.bLeftLooking;
    r.bRangeIncreasing = !options.bFarRangeFirst;
    std::unique_ptr<lumo::sim::RadarScene> poScene;
    std::vector<lumo::sim::SimPoint> asGcps, asChecks;
    SegmentPtr psSegment;
    try {
        const Activity activity("lumo simulate: simulating the radar scene and its points");
        poScene = std::make_unique<lumo::sim::RadarScene>(r);
        SamplePointSets(*poScene, options, &asGcps, &asChecks);
        psSegment.reset(poScene->MakeSegment());
    } catch (const std::exception& e) {
        LUMO_CLI_FAIL(std::string("simulated radar scene: ") + e.what());
    }
    WriteSegmentFile(options.osSegment, *psSegment);
    WriteFileReplacing(options.osGcps, SimulatedPointText(asGcps, "GCP", "LONG/LAT D000"));
    if (!options.osChecks.empty()) {
        WriteFileReplacing(options.osChecks, SimulatedPointText(asChecks, "CHK", "LONG/LAT D000"));
    }
    context.out << "simulated radar scene " << r.nPixels << " x " << r.nLines << ", pixel "
                << FormatDouble(r.dfPixelSpacing) << " m, incidence "
                << Degrees(poScene->IncidenceAt(0.0, 0.5 * r.nLines)) << " to "
                << Degrees(poScene->IncidenceAt(r.nPixels - 1.0, 0.5 * r.nLines))
                << " deg, heights above the ellipsoid\n"
                << "wrote " << options.osSegment << ", " << options.osGcps << " (" << asGcps.size()
                << " control points)";
    if (!options.osChecks.empty()) {
        context.out << ", " << options.osChecks << " (" << asChecks.size() << " check points)";
    }
    context.out << "\n";
}

void RunSimulate(const SimulateOptions& options, CommandContext& context) {
    if (options.bRadar) {
        RunSimulateRadar(options, context);
        return;
    }
    std::unique_ptr<lumo::sim::Scene> poScene;
    std::vector<lumo::sim::SimPoint> asGcps, asChecks;
    try {
        const Activity activity("lumo simulate: simulating the scene and its points");
        poScene = std::make_unique<lumo::sim::Scene>(options.sScene);
        SamplePointSets(*poScene, options, &asGcps, &asChecks);
    } catch (const std::exception& e) {
        LUMO_CLI_FAIL(std::string("simulated scene: ") + e.what());
    }
    SegmentPtr psSegment(poScene->MakeSegment());
    WriteSegmentFile(options.osSegment, *psSegment);
    WriteFileReplacing(options.osGcps, SimulatedPointText(asGcps, "GCP"));
    if (!options.osChecks.empty()) {
        WriteFileReplacing(options.osChecks, SimulatedPointText(asChecks, "CHK"));
    }
    context.out << "simulated " << psSegment->szSensorName << " scene in "
                << poScene->Projection().szProj << ": " << options.sScene.nPixels << " x "
                << options.sScene.nLines << ", pixel " << FormatDouble(psSegment->dfPixelRes)
                << " m, view angle " << FormatDouble(options.sScene.dfRollDeg) << " deg\n"
                << "wrote " << options.osSegment << ", " << options.osGcps << " (" << asGcps.size()
                << " control points)";
    if (!options.osChecks.empty()) {
        context.out << ", " << options.osChecks << " (" << asChecks.size() << " check points)";
    }
    context.out << "\n";
}

}  // namespace

// Simulated points as a point file: id, pixel, line, x, y, z, declaring
// osGeosys when it is given.
std::string SimulatedPointText(const std::vector<lumo::sim::SimPoint>& asPoints,
                               const char* pszPrefix, const std::string& osGeosys) {
    PointSet points;
    points.bHasId = true;
    points.bHasZ = true;
    points.osGeosys = osGeosys;
    for (std::size_t i = 0; i < asPoints.size(); ++i) {
        const lumo::sim::SimPoint& s = asPoints[i];
        PointRecord p;
        p.osId = pszPrefix + std::to_string(i + 1);
        p.dfPixel = s.dfPixel;
        p.dfLine = s.dfLine;
        p.dfX = s.dfX;
        p.dfY = s.dfY;
        p.dfZ = s.dfZ;
        points.asPoints.push_back(p);
    }
    std::ostringstream text;
    WritePoints(text, points,
                {PointColumn::Id, PointColumn::Pixel, PointColumn::Line, PointColumn::X,
                 PointColumn::Y, PointColumn::Z});
    return text.str();
}

void AddSimulateCommand(CLI::App& app, CommandContext& context) {
    auto options = std::make_shared<SimulateOptions>();
    lumo::sim::SceneParams& s = options->sScene;
    CLI::App* command = app.add_subcommand(
        "simulate",
        "Simulate a push-broom (or radar) satellite scene: segment, control and check points");
    lumo::sim::RadarSceneParams& r = options->sRadar;
    r.nPixels = 2000;
    r.nLines = 2000;
    command->add_flag("--radar", options->bRadar,
                      "a zero-Doppler radar scene (ground range) instead of a push-broom one");
    command->add_flag("--ascending", options->bAscending,
                      "radar: ascending pass (default descending)");
    command->add_flag("--left-looking", options->bLeftLooking, "radar: look left of the track");
    command->add_flag("--far-range-first", options->bFarRangeFirst,
                      "radar: pixel 0 at far range (default near range)");
    command->add_option("--incidence", r.dfNearIncidenceDeg,
                        "radar: incidence angle at near range (degrees, default 30)");
    command->add_option("--pixel-spacing", r.dfPixelSpacing,
                        "radar: ground spacing of pixels and lines (m, default 12.5)");
    command->add_option("--reference-height", r.dfReferenceHeight,
                        "radar: height of the ground-range surface, the segment's average "
                        "height (m, default 750)");
    command->add_option("--segment", options->osSegment, "segment file to write (JSON)")
        ->required();
    command->add_option("--gcps", options->osGcps, "control point file to write (CSV)")->required();
    command->add_option("--checks", options->osChecks, "check point file to write (CSV)");
    command->add_option("--count", options->nGcps, "number of control points (default 10)")
        ->check(CLI::Range(1, 100000));
    command->add_option("--check-count", options->nChecks, "number of check points (default 100)")
        ->check(CLI::Range(1, 1000000));
    command->add_option("--seed", options->nSeed, "seed of the point positions and noise");
    command
        ->add_option("--noise", options->dfNoise,
                     "Gaussian noise on the control points' pixel and line (pixels)")
        ->check(CLI::Range(0.0, 1000.0));
    command->add_option("--min-height", options->dfMinHeight, "lowest terrain height (m)");
    command->add_option("--max-height", options->dfMaxHeight, "highest terrain height (m)");
    command->add_option("--roll", s.dfRollDeg, "across-track viewing angle (degrees, + east)");
    command->add_option("--pitch", s.dfPitchDeg, "along-track viewing angle (degrees, + forward)");
    options->poLat =
        command->add_option("--lat", s.dfNadirLatitudeDeg,
                            "latitude of the nadir point (radar: scene centre; degrees)");
    options->poLon =
        command->add_option("--lon", s.dfNadirLongitudeDeg,
                            "longitude of the nadir point (radar: scene centre; degrees)");
    command->add_option("--orbit-radius", s.dfOrbitRadius,
                        "orbit radius from the Earth's centre (m; default 822 km altitude)");
    command->add_option("--inclination", s.dfInclinationDeg, "orbit inclination (degrees)");
    command->add_option("--ifov", s.dfIFOV, "angle of one detector (radians)");
    command->add_option("--line-interval", s.dfLineInterval,
                        "seconds per line (default: square ground pixels at nadir)");
    options->poPixels =
        command->add_option("--pixels", s.nPixels, "detectors in the array (radar: default 2000)");
    options->poLines =
        command->add_option("--lines", s.nLines, "image lines (radar: default 2000)");
    options->poSensor =
        command->add_option("--sensor", s.osSensorName, "sensor name of the segment");
    command->add_option("--zone", s.nUtmZone, "UTM zone of the ground coordinates (default: auto)");
    command->callback([options, &context] { RunSimulate(*options, context); });
}

}  // namespace lumo::cli
