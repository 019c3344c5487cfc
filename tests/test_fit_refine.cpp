// Control point blunders: `lumo fit --refine` and `lumo block --refine` find
// and drop them, the refit equals the fit without them, leave-one-out
// residuals show a blunder whole.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "lumo.h"
#include "points_io.h"
#include "support/cli_runner.h"
#include "support/model_records.h"

namespace {

using lumo::cli::FormatDouble;
const std::string kExamples = std::string(LUMO_SOURCE_DIR) + "/examples/";
using lumo::support::ReadText;
using lumo::support::RunOk;

// The points a --refine run dropped, as the tool lists them.
std::string DroppedList(const std::string& out) {
    const std::size_t at = out.find("dropped by --refine");
    EXPECT_NE(at, std::string::npos) << out;
    return at == std::string::npos ? "" : out.substr(at, out.find('\n', at) - at);
}

class FitRefine : public lumo::support::ScratchDirTest {
  protected:
    // 30 control points of the scene: an affine image of a 60 km UTM square
    // with 0.2 px noise, or (rf) the bundled rational function model's
    // image of the same area in longitude and latitude. Points 4, 17 and 25
    // are blunders of 20, 35 and 50 px. Writes the file with and without
    // them.
    void WritePoints(bool bRf) {
        RFInfo_t* psRF = nullptr;
        lumo::support::RfPtr rf;
        if (bRf) {
            const std::string text = ReadText(kExamples + "rf_scene_RPC.TXT");
            rf.reset(LumoRPCTextToRFInfo(text.data(), text.size(), LUMO_RPC_TEXT_AUTO, "t"));
            psRF = rf.get();
        }
        std::mt19937 rng(11);
        std::normal_distribution<double> noise(0.0, 0.2);
        std::uniform_real_distribution<double> unit(0.0, 1.0);
        std::string all = "id,pixel,line,x,y,z\n", clean = all;
        for (int i = 1; i <= 30; ++i) {
            const double u = unit(rng), v = unit(rng), z = 300.0 + 1000.0 * unit(rng);
            double x = 0.0, y = 0.0, p = 0.0, l = 0.0;
            if (bRf) {
                x = 7.35 + 0.2 * u;
                y = 46.88 + 0.14 * v;
                RFGeo2Img(psRF, x, y, z, &p, &l);
                p += 4.0 + 1e-4 * p;  // the bias the adjustment takes out
                l -= 3.0;
            } else {
                x = 440000.0 + 60000.0 * u;
                y = 5660000.0 + 60000.0 * v;
                p = (x - 440000.0) / 10.0 + 0.002 * (y - 5660000.0);
                l = (5720000.0 - y) / 10.0 + 0.001 * (x - 440000.0);
            }
            p += noise(rng);
            l += noise(rng);
            const std::string row =
                "," + FormatDouble(x) + "," + FormatDouble(y) + "," + FormatDouble(z) + "\n";
            const std::string id = "P" + std::to_string(i);
            clean += i == 4 || i == 17 || i == 25
                         ? ""
                         : id + "," + FormatDouble(p) + "," + FormatDouble(l) + row;
            if (i == 4) p += 20.0;
            if (i == 17) l -= 35.0;
            if (i == 25) p += 30.0, l += 40.0;
            all += id + "," + FormatDouble(p) + "," + FormatDouble(l) + row;
        }
        Write("all.csv", all);
        Write("clean.csv", clean);
    }

    // Fits the points of the named file, with the extra arguments.
    lumo::support::RunResult Fit(bool bRf, const std::string& gcps, const std::string& out,
                                 const std::vector<std::string>& extra = {}) const {
        std::vector<std::string> args = {"fit", "--gcps", Path(gcps), "-o", Path(out), "--model"};
        if (bRf) {
            args.insert(args.end(), {"rf", "--rpc", kExamples + "rf_scene_RPC.TXT"});
        } else {
            args.insert(args.end(), {"poly", "--geosys", "UTM 31 U D000"});
        }
        args.insert(args.end(), extra.begin(), extra.end());
        return RunOk(args);
    }
};

TEST_F(FitRefine, BlundersAreDroppedAndTheRefitEqualsTheCleanFit) {
    for (const bool bRf : {false, true}) {
        WritePoints(bRf);
        const auto refined = Fit(bRf, "all.csv", "refined.json", {"--refine", "3"});
        EXPECT_EQ(refined.osOut.find("residuals before") != std::string::npos, bRf);
        const std::string list = DroppedList(refined.osOut);
        for (const char* id : {"P4 ", "P17 ", "P25 "}) {
            EXPECT_NE(list.find(id), std::string::npos) << id << " in " << list;
        }
        EXPECT_EQ(std::count(list.begin(), list.end(), '('), 3) << list;
        Fit(bRf, "clean.csv", "clean.json");
        const auto a = nlohmann::json::parse(ReadText(Path("refined.json")));
        const auto b = nlohmann::json::parse(ReadText(Path("clean.json")));
        const char* section = bRf ? "rf" : "poly";
        for (const char* key : bRf ? std::vector<const char*>{"pixelAdjust", "lineAdjust"}
                                   : std::vector<const char*>{"pixelCoeffs", "lineCoeffs"}) {
            ASSERT_TRUE(a[section].contains(key)) << key;
            for (std::size_t k = 0; k < a[section][key].size(); ++k) {
                const double va = a[section][key][k], vb = b[section][key][k];
                EXPECT_NEAR(va, vb, 1e-9 * (1.0 + std::fabs(vb))) << key << k;
            }
        }
        // Without --refine the blunders are only reported: the leave-one-out
        // residual of P25 is the blunder's size and beyond that of any other.
        const auto reported = Fit(bRf, "all.csv", "all.json");
        const std::size_t at = reported.osOut.find("\nP25 ");
        ASSERT_NE(at, std::string::npos) << reported.osOut;
        std::istringstream row(reported.osOut.substr(at + 1));
        std::string id, pixel, line;
        double dx = 0.0, dy = 0.0;
        ASSERT_TRUE(row >> id >> pixel >> line >> dx >> dy) << reported.osOut;
        EXPECT_NEAR(std::hypot(dx, dy), 50.0, 4.0) << id;
        EXPECT_EQ(reported.osOut.find("dropped"), std::string::npos);
        // A shift has an RPC equivalent (an affine adjustment with these
        // denominators has none: refused with the tool's other refusals).
        if (bRf) Fit(bRf, "all.csv", "shift.RPB", {"--adjust", "shift"});
    }
}

// In a block the check points of the bundled stereo pair become control
// points and one observation is a 30 px blunder: --refine drops it alone,
// and the report gives every observation's residuals.
TEST_F(FitRefine, BlockDropsTheBlunderedObservation) {
    nlohmann::json project = nlohmann::json::parse(ReadText(kExamples + "block_stereo.json"));
    for (auto& image : project["images"]) {
        image["segment"] = kExamples + image["segment"].get<std::string>();
    }
    for (auto& g : project["gcps"]) {
        g.erase("check");
        if (g["image"] == "left" && g["point"] == "G3") g["pixel"] = g["pixel"].get<double>() + 30;
    }
    const std::string path = Write("block.json", project.dump());
    const auto run = RunOk({"block", path, "-o", Path("out"), "--refine", "2"});
    const std::string list = DroppedList(run.osOut);
    EXPECT_NE(list.find("left/G3 "), std::string::npos) << list;
    EXPECT_EQ(std::count(list.begin(), list.end(), '('), 1) << list;
    const auto report = nlohmann::json::parse(ReadText(Path("out/report.json")));
    ASSERT_EQ(report["controlObservations"].size(), 24u);
    for (const auto& item : report["controlObservations"]) {
        const bool bBlunder = item["observation"] == "left/G3";
        EXPECT_EQ(item.value("dropped", false), bBlunder);
        const double d =
            std::hypot(item["leaveOneOut"][0].get<double>(), item["leaveOneOut"][1].get<double>());
        EXPECT_TRUE(bBlunder ? d > 25.0 : d < 2.0) << item.dump();
    }
}

}  // namespace
