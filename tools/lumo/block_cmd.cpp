// `lumo block PROJECT --output-dir DIR`: the rigorous models of several
// images adjusted together from control and tie points, one model file per
// image and a report of the points' ground estimates.
#include <cctype>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <map>
#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "block_io.h"
#include "cli_error.h"
#include "commands.h"
#include "elevation_separation.h"
#include "fit_refine.h"
#include "geosys_option.h"
#include "model_io.h"
#include "nova/projection.h"
#include "progress.h"
#include "segment_io.h"
#include "srit_io.h"
#include "transform.h"

namespace lumo::cli {
namespace {

struct BlockOptions {
    std::string osProject;
    std::string osOutputDir;
    bool bConstrain = false;      // hold every image's P3 ... P7 near their orbit values
    bool bNoLeaveOneOut = false;  // skip the one adjustment per control observation
    std::string osRefine;         // --refine TOLERANCE[,MIN_POINTS]
    std::string osElevationScale = "curved";
    bool bNoAutoConstrain = false;  // never hold weak images by themselves
};

// How the block is adjusted.
struct BlockSettings {
    bool bConstrain = false;  // every image's constraint flag set
    int32_t nForm = SRIT_FORM_CURVED_INCIDENCE;
    std::vector<char> abHeld;  // per image: constraint flag set, its control being weak
};

// A block needs 3 control observations.
constexpr int kBlockLeastControl = 3;

// Identifier padded with blanks to the library's fixed width.
std::string Padded(const std::string& text) {
    std::string padded = text;
    padded.resize(SRIT_ID_SIZE, ' ');
    return padded;
}

std::string Upper(std::string text) {
    for (char& c : text) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    return text;
}

std::string Trimmed(const char* psz) {
    std::size_t n = strnlen(psz, SRIT_ID_SIZE);
    while (n > 0 && psz[n - 1] == ' ') --n;
    return std::string(psz, n);
}

// Each image's elevation separation over its used control observations
// with heights (elevation_separation.h).
std::vector<ElevationSeparation> ImageSeparations(const BlockProject& project) {
    std::vector<ElevationSeparation> separations;
    for (const BlockImage& image : project.asImages) {
        const SegmentPtr segment = ReadSegmentFile(image.osSegmentPath);
        std::vector<ControlSample> samples;
        for (const BlockGcp& g : project.asGcps) {
            if (g.bCheck || g.dfZ == LUMO_NULL_VALUE || Upper(g.osImage) != Upper(image.osId)) {
                continue;
            }
            samples.push_back({g.dfPixel, g.dfLine, g.dfZ});
        }
        separations.push_back(SeparationOf(*segment, samples));
    }
    return separations;
}

// The settings of the options, with the images whose control points cannot
// separate the elevation terms held near their orbit values unless the
// options hold every image or none by itself.
BlockSettings SettingsFor(const BlockProject& project, const BlockOptions& options,
                          std::vector<ElevationSeparation>* pSeparations) {
    BlockSettings settings;
    settings.bConstrain = options.bConstrain;
    settings.nForm = FormOfWord(options.osElevationScale);
    *pSeparations = ImageSeparations(project);
    for (const ElevationSeparation& separation : *pSeparations) {
        const bool bWeak = separation.Weakest() < kWeakSeparation;
        settings.abHeld.push_back(!options.bConstrain && !options.bNoAutoConstrain && bWeak);
    }
    return settings;
}

// A file name for an image identifier: letters, digits, '-' and '_' kept.
std::string FileStem(const std::string& id) {
    std::string stem = id;
    for (char& c : stem) {
        if (!std::isalnum(static_cast<unsigned char>(c)) && c != '-' && c != '_') c = '_';
    }
    return stem;
}

double NullToNan(double value) {
    return value == LUMO_NULL_VALUE ? std::nan("") : value;
}

nlohmann::json Triple(double a, double b, double c) {
    nlohmann::json values = nlohmann::json::array();
    for (double v : {a, b, c}) {
        if (std::isnan(NullToNan(v))) {
            values.push_back(nullptr);
        } else {
            values.push_back(v);
        }
    }
    return values;
}

// The library's parallel arrays for a project.
struct BlockArrays {
    std::string osImageIds, osGcpImage, osGcpPoint, osGcpUsage, osTieImage, osTiePoint;
    std::vector<double> p, l, x, y, z, sdX, sdY, sdZ, tp, tl, tz, tx, ty;
};

BlockArrays MakeArrays(const BlockProject& project) {
    BlockArrays a;
    std::map<std::string, std::string> ids;  // upper-cased identifier -> as written
    for (const BlockImage& image : project.asImages) {
        if (!ids.emplace(Upper(image.osId), image.osId).second) {
            LUMO_CLI_FAIL(project.osSource + ": image identifier " + Quoted(image.osId) +
                          " is used twice (identifiers ignore case)");
        }
        a.osImageIds += Padded(image.osId);
    }
    const auto requireImage = [&](const std::string& id, const std::string& field) {
        if (ids.count(Upper(id)) == 0) {
            LUMO_CLI_FAIL(project.osSource + ": " + field + " names image " + Quoted(id) +
                          ", which the project does not list");
        }
    };
    for (std::size_t i = 0; i < project.asGcps.size(); ++i) {
        const BlockGcp& g = project.asGcps[i];
        requireImage(g.osImage, "gcps[" + std::to_string(i) + "]");
        a.osGcpImage += Padded(g.osImage);
        a.osGcpPoint += Padded(g.osPoint);
        a.osGcpUsage += g.bCheck ? 'C' : 'A';
        a.p.push_back(g.dfPixel);
        a.l.push_back(g.dfLine);
        a.x.push_back(g.dfX);
        a.y.push_back(g.dfY);
        a.z.push_back(g.dfZ);
        a.sdX.push_back(g.dfSdX);
        a.sdY.push_back(g.dfSdY);
        a.sdZ.push_back(g.dfSdZ);
    }
    for (std::size_t i = 0; i < project.asTies.size(); ++i) {
        const BlockTie& t = project.asTies[i];
        requireImage(t.osImage, "ties[" + std::to_string(i) + "]");
        a.osTieImage += Padded(t.osImage);
        a.osTiePoint += Padded(t.osPoint);
        a.tp.push_back(t.dfPixel);
        a.tl.push_back(t.dfLine);
        a.tz.push_back(t.dfZ);
    }
    a.tx.assign(a.tp.size(), 0.0);
    a.ty.assign(a.tp.size(), 0.0);
    return a;
}

// Root mean square image residual of a project's control observations of
// one kind (used or check) in one image; observations the model cannot map
// are counted apart.
nlohmann::json ImageResiduals(const BlockProject& project, const std::string& id,
                              const SRITInfo_t& model, bool bCheck) {
    double sumPixel = 0.0, sumLine = 0.0;
    int count = 0;
    int failed = 0;  // observations the model maps to no image position
    for (const BlockGcp& g : project.asGcps) {
        if (g.bCheck != bCheck || Upper(g.osImage) != Upper(id) || g.dfZ == LUMO_NULL_VALUE) {
            continue;
        }
        double pixel = 0.0, line = 0.0;
        if (!SritToImage(model, g.dfX, g.dfY, g.dfZ, &pixel, &line) || !IsPosition(pixel, line)) {
            ++failed;
            continue;
        }
        sumPixel += (pixel - g.dfPixel) * (pixel - g.dfPixel);
        sumLine += (line - g.dfLine) * (line - g.dfLine);
        ++count;
    }
    nlohmann::json result{{"count", count}};
    if (failed > 0) result["failed"] = failed;
    if (count > 0) {
        result["rmsPixel"] = std::sqrt(sumPixel / count);
        result["rmsLine"] = std::sqrt(sumLine / count);
    }
    return result;
}

// The adjusted block: one model per image, the report arrays and the tie
// outputs.
struct BlockResult {
    BlockArrays a;
    std::vector<SritPtr> models;
    int nReported = 0;
    std::vector<char> reportedIds;
    std::vector<int> reportedImages;
    std::vector<double> out[9];  // given, estimated, residual X Y Z
};

BlockResult ComputeBlock(const BlockProject& project, const BlockSettings& settings) {
    std::vector<SegmentPtr> segments;
    for (std::size_t k = 0; k < project.asImages.size(); ++k) {
        segments.push_back(ReadSegmentFile(project.asImages[k].osSegmentPath));
        // The segment's constraint flag asks the adjustment for the
        // pseudo-observations; the written models carry it.
        const bool bHeld = k < settings.abHeld.size() && settings.abHeld[k] != 0;
        if (settings.bConstrain || bHeld) segments.back()->nSupplementFlag = 1;
    }
    const EphemerisSeg_t& first = *segments.front();
    const std::string geosys =
        !project.osGeosys.empty()
            ? project.osGeosys
            : std::string(first.szGeosys, strnlen(first.szGeosys, sizeof first.szGeosys));
    if (geosys.empty()) {
        LUMO_CLI_FAIL(project.osSource +
                      ": neither the project (geosys) nor the first segment "
                      "names the projection of the ground coordinates");
    }
    const std::string where = !project.osGeosys.empty()
                                  ? project.osSource + ": field \"geosys\""
                                  : project.asImages.front().osSegmentPath + ": szGeosys";
    const ProjInfo_t proj = UserGeosys(geosys, where);
    BlockResult r;
    r.a = MakeArrays(project);
    BlockArrays& a = r.a;
    const std::size_t nImages = project.asImages.size();
    std::vector<SRITInfo_t*> modelPointers;
    std::vector<EphemerisSeg_t*> segmentPointers;
    for (std::size_t k = 0; k < nImages; ++k) {
        r.models.emplace_back(SRITAllocate());
        r.models.back()->anAux[SRIT_AUX_FORM] = settings.nForm;
        modelPointers.push_back(r.models.back().get());
        segmentPointers.push_back(segments[k].get());
    }
    const std::size_t nGcp = a.x.size();
    r.reportedIds.assign((nGcp + 1) * SRIT_ID_SIZE, '\0');
    r.reportedImages.assign(nGcp + 1, 0);
    for (auto& values : r.out) values.assign(nGcp + 1, 0.0);
    const int result = SRITCalculateN(
        static_cast<int>(nImages), a.osImageIds.data(), modelPointers.data(), true,
        segmentPointers.data(), &proj, static_cast<int>(nGcp), a.osGcpImage.data(),
        a.osGcpPoint.data(), a.osGcpUsage.data(), a.p.data(), a.l.data(), a.z.data(), nullptr,
        nullptr, a.sdZ.data(), a.x.data(), a.y.data(), a.sdX.data(), a.sdY.data(),
        static_cast<int>(a.tp.size()), a.osTieImage.data(), a.osTiePoint.data(), a.tp.data(),
        a.tl.data(), a.tz.data(), nullptr, nullptr, nullptr, a.tx.data(), a.ty.data(), &r.nReported,
        r.reportedIds.data(), r.reportedImages.data(), r.out[0].data(), r.out[1].data(),
        r.out[2].data(), r.out[3].data(), r.out[4].data(), r.out[5].data(), r.out[6].data(),
        r.out[7].data(), r.out[8].data());
    if (result != 1) {
        LUMO_CLI_FAIL(project.osSource +
                      ": no block model could be computed (the block needs at least 3 control "
                      "observations and every image 4, 5 for radar)");
    }
    for (SegmentPtr& segment : segments) static_cast<void>(segment.release());  // adopted
    return r;
}

// Distinct tie points in order of first observation, with the index of that
// observation.
std::vector<std::size_t> FirstTieObservations(const BlockProject& project) {
    std::vector<std::size_t> first;
    std::map<std::string, bool> seen;
    for (std::size_t i = 0; i < project.asTies.size(); ++i) {
        if (seen.emplace(Upper(project.asTies[i].osPoint), true).second) first.push_back(i);
    }
    return first;
}

// The control observations that take part in the adjustment (not check
// points, with a height), named IMAGE/POINT for the residual table.
struct ControlObservations {
    PointSet points;
    std::vector<std::size_t> index;  // into the project's control observations
};

ControlObservations UsedControl(const BlockProject& project) {
    ControlObservations c;
    c.points.osSource = project.osSource;
    c.points.bHasId = true;
    for (std::size_t i = 0; i < project.asGcps.size(); ++i) {
        const BlockGcp& g = project.asGcps[i];
        if (g.bCheck || g.dfZ == LUMO_NULL_VALUE) continue;
        PointRecord p;
        p.osId = g.osImage + "/" + g.osPoint;
        p.dfPixel = g.dfPixel;
        p.dfLine = g.dfLine;
        c.points.asPoints.push_back(p);
        c.index.push_back(i);
    }
    return c;
}

// The project without the control observations whose flag in `use` is clear.
BlockProject Without(const BlockProject& project, const ControlObservations& c,
                     const std::vector<char>& use) {
    std::vector<char> drop(project.asGcps.size(), 0);
    for (std::size_t k = 0; k < use.size(); ++k) drop[c.index[k]] = use[k] ? 0 : 1;
    BlockProject kept = project;
    kept.asGcps.clear();
    for (std::size_t i = 0; i < project.asGcps.size(); ++i) {
        if (!drop[i]) kept.asGcps.push_back(project.asGcps[i]);
    }
    return kept;
}

std::size_t ImageIndex(const BlockProject& project, const std::string& id) {
    for (std::size_t k = 0; k < project.asImages.size(); ++k) {
        if (Upper(project.asImages[k].osId) == Upper(id)) return k;
    }
    return 0;  // MakeArrays has refused observations of unknown images
}

// The block adjusted with some of the control observations, mapping every
// observation into its image.
ImageFit BlockImageFit(const BlockProject& project, const ControlObservations& c,
                       const BlockSettings& settings) {
    return [&project, &c, settings](const std::vector<char>& use, std::vector<double>& pixel,
                                    std::vector<double>& line) {
        try {
            const BlockResult r = ComputeBlock(Without(project, c, use), settings);
            pixel.resize(c.index.size());
            line.resize(c.index.size());
            for (std::size_t k = 0; k < c.index.size(); ++k) {
                const BlockGcp& g = project.asGcps[c.index[k]];
                const SRITInfo_t& model = *r.models[ImageIndex(project, g.osImage)];
                if (!SritToImage(model, g.dfX, g.dfY, g.dfZ, &pixel[k], &line[k]) ||
                    !IsPosition(pixel[k], line[k])) {
                    return false;
                }
            }
        } catch (const nova::DataException&) {
            return false;  // too few observations left; the final run says why
        }
        return true;
    };
}

// Each control observation's residual and leave-one-out residual for the
// report.
nlohmann::json ObservationResiduals(const ControlObservations& c, const FitResiduals& residuals) {
    nlohmann::json list = nlohmann::json::array();
    for (std::size_t k = 0; k < c.index.size(); ++k) {
        const PointResidual& r = residuals.asPoints[k];
        nlohmann::json item{{"observation", c.points.asPoints[k].osId},
                            {"residual", {r.dfPixel, r.dfLine}}};
        if (r.bLoo) item["leaveOneOut"] = {r.dfLooPixel, r.dfLooLine};
        if (r.bDropped) item["dropped"] = true;
        list.push_back(item);
    }
    return list;
}

void RunBlock(const BlockOptions& options, CommandContext& context) {
    const BlockProject allControl = ReadBlockProject(options.osProject);
    const RefineOptions refine =
        options.osRefine.empty() ? RefineOptions{} : ParseRefine(options.osRefine);
    if (refine.bEnabled && options.bNoLeaveOneOut) {
        throw CLI::ValidationError(
            "--refine needs the leave-one-out residuals: drop "
            "--no-leave-one-out");
    }
    std::vector<ElevationSeparation> separations;
    BlockSettings settings = SettingsFor(allControl, options, &separations);
    const ControlObservations control = UsedControl(allControl);
    FitResiduals residuals;
    if (!options.bNoLeaveOneOut) {
        residuals = RefineAndMeasure(BlockImageFit(allControl, control, settings), control.points,
                                     kBlockLeastControl, refine, "lumo block");
    }
    const BlockProject project =
        residuals.anDropped.empty() ? allControl : Without(allControl, control, residuals.use);
    if (!residuals.anDropped.empty()) settings = SettingsFor(project, options, &separations);
    BlockResult r = [&] {
        const Activity activity("lumo block: adjusting " + std::to_string(project.asImages.size()) +
                                " images");
        return ComputeBlock(project, settings);
    }();
    const BlockArrays& a = r.a;
    const auto& models = r.models;
    const auto& out = r.out;
    const int nReported = r.nReported;
    const std::size_t nImages = project.asImages.size();
    const std::size_t nGcp = a.x.size();
    std::filesystem::create_directories(options.osOutputDir);
    nlohmann::json report{{"format", "lumo-block-report"}, {"version", 1}};
    report["images"] = nlohmann::json::array();
    for (std::size_t k = 0; k < nImages; ++k) {
        const std::string& id = project.asImages[k].osId;
        const std::string path =
            (std::filesystem::path(options.osOutputDir) / (FileStem(id) + ".model.json")).string();
        WriteModelFile(path, SritToJson(*models[k]));
        const SRITInfo_t& model = *models[k];
        const bool bConstrained =
            model.psEphemeris != nullptr && model.psEphemeris->nSupplementFlag != 0;
        nlohmann::json image{
            {"id", id},
            {"model", path},
            {"sensor", std::string(model.Sensor, strnlen(model.Sensor, SRIT_SENSOR_SIZE))},
            {"constrained", bConstrained},
            {"elevationSeparation",
             {{"across", separations[k].dfAcross}, {"along", separations[k].dfAlong}}},
            {"controlResiduals", ImageResiduals(project, id, model, false)},
            {"checkResiduals", ImageResiduals(project, id, model, true)}};
        if (bConstrained) {
            image["constrainedBy"] = options.bConstrain   ? "--constrain"
                                     : settings.abHeld[k] ? "weak control points"
                                                          : "segment";
        }
        report["images"].push_back(image);
        if (settings.abHeld[k]) {
            context.out << "image " << id
                        << ": its control points cannot separate the elevation terms (out-of-plane "
                           "spread across "
                        << FormatShort(separations[k].dfAcross) << ", along "
                        << FormatShort(separations[k].dfAlong) << " of their height spread, below "
                        << FormatShort(kWeakSeparation) << "): held near its orbit values\n";
        }
        context.out << "image " << id << ": wrote " << path << "\n";
    }
    report["controlPoints"] = nlohmann::json::array();
    for (int i = 0; i < nReported; ++i) {
        report["controlPoints"].push_back(
            {{"point", Trimmed(r.reportedIds.data() + static_cast<std::size_t>(i) * SRIT_ID_SIZE)},
             {"images", r.reportedImages[i]},
             {"given", Triple(out[0][i], out[1][i], out[2][i])},
             {"estimated", Triple(out[3][i], out[4][i], out[5][i])},
             {"residual", Triple(out[6][i], out[7][i], out[8][i])}});
    }
    report["tiePoints"] = nlohmann::json::array();
    for (std::size_t i : FirstTieObservations(project)) {
        const BlockTie& tie = project.asTies[i];
        report["tiePoints"].push_back({{"point", tie.osPoint},
                                       {"elevationGiven", tie.dfZ != LUMO_NULL_VALUE},
                                       {"ground", Triple(a.tx[i], a.ty[i], a.tz[i])}});
    }
    if (residuals.bFitted) {
        report["controlObservations"] = ObservationResiduals(control, residuals);
        PrintPointResiduals(context.out, control.points, residuals);
    }
    const std::string reportPath =
        (std::filesystem::path(options.osOutputDir) / "report.json").string();
    WriteFileReplacing(reportPath, report.dump(2) + "\n");
    context.out << "block of " << nImages << " images: " << nGcp << " control observations, "
                << a.tp.size() << " tie observations (" << report["tiePoints"].size()
                << " tie points), " << nReported << " control points in several images\nwrote "
                << reportPath << "\n";
}

}  // namespace

void PrintBlockDemo(const std::string& examplesDir, std::ostream& out) {
    const BlockProject project =
        ReadBlockProject((std::filesystem::path(examplesDir) / "block_stereo.json").string());
    std::vector<ElevationSeparation> separations;
    const BlockResult r = ComputeBlock(project, SettingsFor(project, BlockOptions{}, &separations));
    out << "\nblock adjustment of block_stereo.json: " << project.asImages.size() << " images, "
        << FirstTieObservations(project).size() << " tie points of unknown elevation\n";
    char line[200];
    for (std::size_t k = 0; k < project.asImages.size(); ++k) {
        const nlohmann::json check =
            ImageResiduals(project, project.asImages[k].osId, *r.models[k], true);
        std::snprintf(line, sizeof line, "  image %-8s check points %d, rms pixel %.3f line %.3f\n",
                      project.asImages[k].osId.c_str(), check["count"].get<int>(),
                      check.value("rmsPixel", 0.0), check.value("rmsLine", 0.0));
        out << line;
    }
    for (std::size_t i : FirstTieObservations(project)) {
        std::snprintf(line, sizeof line, "  tie %-8s ground %.2f %.2f elevation %.2f\n",
                      project.asTies[i].osPoint.c_str(), r.a.tx[i], r.a.ty[i], r.a.tz[i]);
        out << line;
    }
}

void AddBlockCommand(CLI::App& app, CommandContext& context) {
    auto options = std::make_shared<BlockOptions>();
    CLI::App* command = app.add_subcommand(
        "block", "Adjust the rigorous models of several images together (control and tie points)");
    command->add_option("project", options->osProject, "block project file (JSON)")->required();
    command
        ->add_option("-o,--output-dir", options->osOutputDir,
                     "directory for the model files and report.json")
        ->required();
    command->add_flag("--constrain", options->bConstrain,
                      "hold every image's scale, obliquity and shear terms near the values of "
                      "its orbit (as a segment's constraint flag does); steadies images whose "
                      "few control points cannot separate the elevation terms");
    command->add_flag("--no-auto-constrain", options->bNoAutoConstrain,
                      "adjust images whose control points cannot separate the elevation terms "
                      "like the others (by default they are held near their orbit values)");
    AddElevationScaleOption(*command, options->osElevationScale);
    command->add_option("--refine", options->osRefine,
                        "TOLERANCE[,MIN_POINTS]: drop the control observation with the largest "
                        "leave-one-out residual beyond TOLERANCE pixels and adjust again, until "
                        "none is beyond it or MIN_POINTS are left");
    command->add_flag("--no-leave-one-out", options->bNoLeaveOneOut,
                      "skip the leave-one-out residuals (one more adjustment per control "
                      "observation)");
    command->callback([options, &context] { RunBlock(*options, context); });
}

}  // namespace lumo::cli
