// `lumo angles MODEL -o OUT [--format csv|raw] [--step N] [--encoded]`: the
// five angle layers of an orbit model's image (satellite zenith and azimuth,
// solar zenith and azimuth, relative azimuth, degrees) from the model's
// 20-pixel angle grids, as CSV or as raw float32 layers with an ENVI header.
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <memory>
#include <ostream>
#include <string>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"
#include "lrs_io.h"
#include "model_io.h"
#include "points_io.h"
#include "progress.h"

namespace lumo::cli {
namespace {

constexpr int kLayers = LRS_NUM_ANGLE_GRIDS;
const char* const kLayerNames[kLayers] = {"sat_zenith", "sat_azimuth", "sun_zenith", "sun_azimuth",
                                          "rel_azimuth"};

struct AnglesOptions {
    std::string osModel;
    std::string osOutput;
    std::string osFormat = "csv";
    int nStep = 1;
    bool bEncoded = false;
};

// A file written under a temporary name and renamed into place once
// complete; removed when the run fails before that.
class ReplacingFile {
  public:
    explicit ReplacingFile(std::string path) : mosPath(std::move(path)), mosTemp(mosPath + ".tmp") {
        moStream.open(mosTemp, std::ios::binary | std::ios::trunc);
        if (!moStream) LUMO_CLI_FAIL(mosTemp + ": cannot create file");
    }
    ReplacingFile(const ReplacingFile&) = delete;
    ReplacingFile& operator=(const ReplacingFile&) = delete;
    ~ReplacingFile() {
        if (!mbDone) {
            moStream.close();
            std::remove(mosTemp.c_str());
        }
    }
    std::ostream& Stream() { return moStream; }
    void Commit() {
        moStream.close();
        if (!moStream) LUMO_CLI_FAIL(mosTemp + ": write failed");
        if (std::rename(mosTemp.c_str(), mosPath.c_str()) != 0) {
            LUMO_CLI_FAIL(mosPath + ": cannot replace file");
        }
        mbDone = true;
    }

  private:
    std::string mosPath;
    std::string mosTemp;
    std::ofstream moStream;
    bool mbDone = false;
};

struct Raster {
    LRSOrbitModel_t* psModel;
    int nStep;
    int nDecode;
    int Columns() const { return (psModel->sSensor.nNumPixels + nStep - 1) / nStep; }
    int Rows() const { return (psModel->nNumScanLines + nStep - 1) / nStep; }
    // The angles at the centre of sample (i, j); only the layers asked for.
    void Angles(int i, int j, double* padfOut, bool bAll, int nLayer) const {
        double* apdf[kLayers] = {};
        for (int k = 0; k < kLayers; ++k) apdf[k] = (bAll || k == nLayer) ? padfOut + k : nullptr;
        LRSComputeInterpolatedAngles(psModel, i * nStep + 0.5, j * nStep + 0.5, apdf[0], apdf[1],
                                     apdf[2], apdf[3], apdf[4], nDecode, nullptr, nullptr);
    }
};

void WriteCsv(const Raster& r, const std::string& path) {
    ReplacingFile file(path);
    std::ostream& out = file.Stream();
    out << "# lumo angles: degrees; azimuths clockwise from north"
        << (r.nDecode ? "" : "; satellite and relative azimuths encoded on the right half") << "\n";
    out << "pixel,line";
    for (const char* pszName : kLayerNames) out << "," << pszName;
    out << "\n";
    Progress progress("angles", static_cast<std::size_t>(r.Rows()));
    char szLine[256];
    for (int j = 0; j < r.Rows(); ++j) {
        for (int i = 0; i < r.Columns(); ++i) {
            double a[kLayers];
            r.Angles(i, j, a, true, 0);
            std::snprintf(szLine, sizeof szLine, "%.1f,%.1f,%.4f,%.4f,%.4f,%.4f,%.4f\n",
                          i * r.nStep + 0.5, j * r.nStep + 0.5, a[0], a[1], a[2], a[3], a[4]);
            out << szLine;
        }
        progress.Update(static_cast<std::size_t>(j) + 1);
    }
    file.Commit();
}

// float32 little-endian whatever the machine's byte order.
void PutFloat(std::ostream& out, double dfValue) {
    const float fValue = static_cast<float>(dfValue);
    std::uint32_t nBits = 0;
    std::memcpy(&nBits, &fValue, sizeof nBits);
    const char abyBytes[4] = {
        static_cast<char>(nBits & 0xff), static_cast<char>((nBits >> 8) & 0xff),
        static_cast<char>((nBits >> 16) & 0xff), static_cast<char>((nBits >> 24) & 0xff)};
    out.write(abyBytes, 4);
}

void WriteRaw(const Raster& r, const std::string& path) {
    ReplacingFile file(path);
    ReplacingFile header(path + ".hdr");
    Progress progress("angles", static_cast<std::size_t>(r.Rows()) * kLayers);
    for (int k = 0; k < kLayers; ++k) {  // band after band
        for (int j = 0; j < r.Rows(); ++j) {
            for (int i = 0; i < r.Columns(); ++i) {
                double a[kLayers] = {};
                r.Angles(i, j, a, false, k);
                PutFloat(file.Stream(), a[k]);
            }
            progress.Update(static_cast<std::size_t>(k) * r.Rows() + j + 1);
        }
    }
    header.Stream()
        << "ENVI\ndescription = {lumo angles (degrees, azimuths clockwise from north)}\n"
        << "samples = " << r.Columns() << "\nlines = " << r.Rows() << "\nbands = " << kLayers
        << "\nheader offset = 0\nfile type = ENVI Standard\ndata type = 4\n"
        << "interleave = bsq\nbyte order = 0\nband names = {";
    for (int k = 0; k < kLayers; ++k) header.Stream() << (k ? ", " : "") << kLayerNames[k];
    header.Stream() << "}\n";
    file.Commit();
    header.Commit();
}

void RunAngles(const AnglesOptions& options, CommandContext& context) {
    const LoadedModel model = ReadModelFile(options.osModel);
    if (model.nModelCode != LUMO_CODE_LRS) {
        LUMO_CLI_FAIL(options.osModel + ": angles need an orbit model (\"lrs\"), found " +
                      Quoted(model.sEnvelope.osFamily));
    }
    auto* psModel = static_cast<LRSOrbitModel_t*>(model.poRecord.get());
    CheckedLrsCall(options.osModel, [psModel] { LRSSetupOrbitModelForAngleGeneration(psModel); });
    const Raster r{psModel, options.nStep, options.bEncoded ? 0 : 1};
    if (options.osFormat == "csv") {
        WriteCsv(r, options.osOutput);
    } else {
        WriteRaw(r, options.osOutput);
    }
    context.out << "wrote " << options.osOutput << ": " << kLayers << " angle layers of "
                << r.Columns() << " x " << r.Rows() << " samples"
                << (options.osFormat == "raw"
                        ? " (float32, band-sequential, header " + options.osOutput + ".hdr)"
                        : std::string())
                << "\n";
}

}  // namespace

void AddAnglesCommand(CLI::App& app, CommandContext& context) {
    auto options = std::make_shared<AnglesOptions>();
    CLI::App* command = app.add_subcommand(
        "angles", "Write the sun and satellite angle layers of an orbit model's image");
    command->add_option("model", options->osModel, "orbit model file (JSON, family lrs)")
        ->required();
    command->add_option("-o,--output", options->osOutput, "file to write")->required();
    command->add_option("--format", options->osFormat, "csv (default) or raw (float32 + .hdr)")
        ->check(CLI::IsMember({"csv", "raw"}));
    command->add_option("--step", options->nStep, "every N-th pixel and line (default 1)")
        ->check(CLI::Range(1, 100000));
    command->add_flag("--encoded", options->bEncoded,
                      "keep the right half's satellite and relative azimuths encoded (-180/+180)");
    command->callback([options, &context] { RunAngles(*options, context); });
}

}  // namespace lumo::cli
