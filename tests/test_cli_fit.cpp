// The fitting commands of the lumo tool end to end: fit -> transform ->
// residuals for polynomial and spline models and their model files, and the
// warnings the fits give.
#include <gtest/gtest.h>

#include <cmath>
#include <sstream>
#include <string>
#include <vector>

#include "cli.h"
#include "lumo.h"
#include "model_io.h"
#include "nova/regression.h"
#include "nova/runtime.h"
#include "points_io.h"
#include "support/cli_runner.h"
#include "tool_warnings.h"
#include "tps_io.h"

using lumo::cli::PointKind;
using nlohmann::json;

namespace {

const std::string kExamples = std::string(LUMO_SOURCE_DIR) + "/examples";
const std::string kGcps = kExamples + "/poly_utm31_gcps.csv";
constexpr const char* kGeosys = "UTM 31 U D000";

using lumo::support::ReadText;
using lumo::support::RunOk;
using lumo::support::RunResult;
using lumo::support::RunTool;

using FitTest = lumo::support::ScratchDirTest;

// A number that follows `label` in the text (e.g. "rms dpixel 1.2e-05").
double NumberAfter(const std::string& text, const std::string& label) {
    double dfValue = std::nan("");
    std::istringstream after;
    const std::size_t at = text.find(label + " ");
    if (at != std::string::npos) after.str(text.substr(at + label.size()));
    if (!(after >> dfValue)) ADD_FAILURE() << "no number after " << label << " in:\n" << text;
    return dfValue;
}

TEST_F(FitTest, PolyFitTransformResidualsEndToEnd) {
    const std::string model = Path("poly.json");
    RunResult r = RunOk({"fit", "--model", "poly", "--gcps", kGcps, "--order", "2", "--geosys",
                         kGeosys, "-o", model});
    EXPECT_NE(r.osOut.find("order 2 (6 terms) to 15 control points"), std::string::npos);
    const lumo::cli::LoadedModel loaded = lumo::cli::ReadModelFile(model);
    ASSERT_EQ(loaded.nModelCode, LUMO_CODE_POLY);
    EXPECT_EQ(loaded.AsPoly()->nCoeffs, 6);
    EXPECT_EQ(loaded.sEnvelope.osGeosys, kGeosys);
    EXPECT_EQ(loaded.sEnvelope.nPixels, 5812);  // largest pixel 5811.00 lies inside
    EXPECT_EQ(loaded.sEnvelope.nLines, 5891);

    // The residual table is a point file whose residuals are the transform's
    // positions less the control points'; the summary's RMS is its rows'.
    const std::string table = Path("residuals.csv");
    const std::string summary = RunOk({"residuals", model, "--gcps", kGcps, "-o", table}).osOut;
    EXPECT_EQ(lumo::cli::ReadPointsFile(table, PointKind::ControlPoint).osGeosys, kGeosys);
    std::istringstream transformed(RunOk({"transform", model, "--to-image", kGcps}).osOut);
    const auto mapped = lumo::cli::ReadPoints(transformed, "out", PointKind::ControlPoint);
    const auto gcps = lumo::cli::ReadPointsFile(kGcps, PointKind::ControlPoint);
    ASSERT_EQ(mapped.asPoints.size(), 15u);
    std::istringstream tableText(ReadText(table));
    std::string row;
    std::getline(tableText, row);  // the georeferencing comment
    std::getline(tableText, row);
    EXPECT_EQ(row, "id,pixel,line,x,y,z,dpixel,dline,dx,dy,status");
    double sumPixel2 = 0, sumX2 = 0;
    for (std::size_t i = 0; i < 15; ++i) {
        std::getline(tableText, row);
        std::vector<std::string> f;
        std::stringstream fields(row);
        for (std::string item; std::getline(fields, item, ',');) f.push_back(item);
        ASSERT_EQ(f.size(), 11u);
        EXPECT_EQ(f[0] + f[10], gcps.asPoints[i].osId + "ok");
        EXPECT_DOUBLE_EQ(std::stod(f[6]), mapped.asPoints[i].dfPixel - gcps.asPoints[i].dfPixel);
        EXPECT_DOUBLE_EQ(std::stod(f[7]), mapped.asPoints[i].dfLine - gcps.asPoints[i].dfLine);
        sumPixel2 += std::pow(std::stod(f[6]), 2), sumX2 += std::pow(std::stod(f[8]), 2);
    }
    EXPECT_NEAR(NumberAfter(summary, "rms dpixel"), std::sqrt(sumPixel2 / 15), 1e-5);
    EXPECT_NEAR(NumberAfter(summary, "rms dx"), std::sqrt(sumX2 / 15), 1e-4);
}

TEST_F(FitTest, PolyOrdersAndRawCoefficientPrecision) {
    // Order 5 needs 21 points: lowered to 4 when allowed, with the reason.
    RunResult r = RunOk({"fit", "--model", "poly", "--gcps", kGcps, "--order", "5", "--geosys",
                         kGeosys, "--allow-lower-order", "-o", Path("p5.json")});
    EXPECT_NE(r.osErr.find("determine only order 4"), std::string::npos);
    EXPECT_EQ(lumo::cli::ReadModelFile(Path("p5.json")).AsPoly()->nCoeffs, 15);

    // A 7 x 7 grid of UTM points with a fifth-order distortion: order 5 is
    // determined, and its raw-coordinate coefficients lose digits to
    // cancellation. The model file keeps the fit, so the tool maps the points
    // exactly as the regression fitted here does, bit for bit.
    std::string csv = "id,pixel,line,x,y\n";
    std::vector<double> gp, gl, gx, gy;
    for (int i = 0; i < 7; ++i) {
        for (int j = 0; j < 7; ++j) {
            const double p = i * 1000.0 + 13.7 * j, l = j * 1000.0 + 7.1 * i;
            const double u = p / 6000, v = l / 6000;
            const double x = 440000 + 10 * p + 0.08 * l + 30 * u * u * v + 20 * std::pow(u, 5);
            const double y = 5720000 - 10 * l + 0.09 * p + 25 * u * v * v - 12 * std::pow(v, 5);
            csv += "P" + std::to_string(i * 7 + j) + "," + lumo::cli::FormatDouble(p) + "," +
                   lumo::cli::FormatDouble(l) + "," + lumo::cli::FormatDouble(x) + "," +
                   lumo::cli::FormatDouble(y) + "\n";
            gp.push_back(p), gl.push_back(l), gx.push_back(x), gy.push_back(y);
        }
    }
    const std::string grid = Write("grid.csv", csv);
    r = RunOk({"fit", "--model", "poly", "--gcps", grid, "--order", "5", "--geosys", kGeosys, "-o",
               Path("g5.json")});
    EXPECT_NE(r.osErr.find("note: with these ground coordinates the raw coefficients"),
              std::string::npos)
        << r.osErr;
    GEOInfo_t forward{}, inverse{};
    int order = 5;
    GCPRegression2(&forward, kGeosys, gx.data(), gy.data(), "PIXEL", gp.data(), gl.data(), 49,
                   &order, 0, nullptr, nullptr);
    GCPRegression2(&inverse, "PIXEL", gp.data(), gl.data(), kGeosys, gx.data(), gy.data(), 49,
                   &order, 0, nullptr, nullptr);
    const lumo::cli::LoadedModel loaded = lumo::cli::ReadModelFile(Path("g5.json"));
    ASSERT_TRUE(loaded.poPolyFit);
    for (std::size_t k = 0; k < gp.size(); ++k) {
        double p1 = 0, l1 = 0, p2 = 0, l2 = 0, x1 = 0, y1 = 0, x2 = 0, y2 = 0;
        ASSERT_EQ(loaded.GroundToImage(gx[k], gy[k], 0.0, &p1, &l1), 1);
        GCPTransform(&forward, gx[k], gy[k], &p2, &l2);
        EXPECT_EQ(p1, p2);
        EXPECT_EQ(l1, l2);
        ASSERT_EQ(loaded.ImageToGround(gp[k], gl[k], 0.0, &x1, &y1), 1);
        GCPTransform(&inverse, gp[k], gl[k], &x2, &y2);
        EXPECT_EQ(x1, x2);
        EXPECT_EQ(y1, y2);
    }
}

TEST_F(FitTest, TpsFitTransformResidualsEndToEnd) {
    const std::string model = Path("tps.json");
    const RunResult r = RunOk({"fit", "--model", "tps", "--gcps", kGcps, "--geosys", kGeosys,
                               "--pixels", "6000", "--lines", "6000", "-o", model});
    EXPECT_NE(r.osOut.find("rank ground->image 18, image->ground 18"), std::string::npos);

    // The file holds, to the bit, the spline fitted here in memory, and
    // writing the record read back gives the same file.
    const json document = json::parse(ReadText(model));
    const lumo::cli::LoadedModel loaded = lumo::cli::ReadModelFile(model);
    ASSERT_EQ(loaded.nModelCode, LUMO_CODE_TPS);
    auto* fromFile = static_cast<TPSMInfo_t*>(loaded.poRecord.get());
    EXPECT_EQ(fromFile->nPixels, 6000);
    EXPECT_STREQ(fromFile->pszGeosys, kGeosys);
    EXPECT_EQ(lumo::cli::TpsToJson(*fromFile), document);
    std::vector<double> px, ln, x, y;
    for (const auto& p : lumo::cli::ReadPointsFile(kGcps, PointKind::ControlPoint).asPoints) {
        px.push_back(p.dfPixel), ln.push_back(p.dfLine), x.push_back(p.dfX), y.push_back(p.dfY);
    }
    lumo::cli::TpsPtr direct(TPSAllocate(nullptr));
    TRNCalculate(direct->psGeoToImage, 15, x.data(), y.data(), px.data(), ln.data(), nullptr);
    TRNCalculate(direct->psImageToGeo, 15, px.data(), ln.data(), x.data(), y.data(), nullptr);
    EXPECT_EQ(lumo::cli::TpsToJson(*direct)["tps"].dump(), document["tps"].dump());

    // Transform and residuals run on the file.
    RunOk({"transform", model, "--to-ground", kGcps});
    EXPECT_LT(NumberAfter(RunOk({"residuals", model, "--gcps", kGcps}).osOut, "rms dx"), 1e-4);

    // Fewer than 4 points give an affine spline, written with nCPs 0.
    const std::string three =
        Write("three.csv", "pixel,line,x,y\n0,0,1000,2000\n10,0,1100,2000\n0,10,1000,1900\n");
    RunOk({"fit", "--model", "tps", "--gcps", three, "--geosys", kGeosys, "-o", Path("a.json")});
    const lumo::cli::LoadedModel affine = lumo::cli::ReadModelFile(Path("a.json"));
    double p = 0, l = 0;
    ASSERT_EQ(GenGeo2Img(LUMO_CODE_TPS, affine.poRecord.get(), 1050.0, 1950.0, 0.0, &p, &l), 1);
    EXPECT_NEAR(p, 5.0, 1e-9);
    EXPECT_NEAR(l, 5.0, 1e-9);
}

TEST_F(FitTest, WarningsSpeakTheCommandsWords) {
    // Collinear points: the spline says so in its own terms, not in those of
    // the regression behind its affine part.
    const RunResult r =
        RunTool({"fit", "--model", "tps", "--geosys", kGeosys, "-o", Path("l.json"), "--gcps",
                 Write("line.csv",
                       "pixel,line,x,y\n0,0,1000,2000\n10,10,1100,1900\n20,20,1200,1800\n"
                       "30,30,1300,1700\n40,40,1400,1600\n")});
    EXPECT_NE(r.osErr.find("the control points lie on one line"), std::string::npos) << r.osErr;
    EXPECT_EQ(r.osErr.find("Polynomial order"), std::string::npos) << r.osErr;
    EXPECT_EQ(r.osErr.find("E100"), std::string::npos) << r.osErr;
    // Any other warning of a run is shown as its detail, without the
    // catalogue heading of a failure.
    std::ostringstream shown;
    {
        const lumo::cli::ToolWarnings warnings(shown);
        IMPError(100, 0, "the segment is short");
        IMPErrMsg(11, 0);
    }
    EXPECT_EQ(shown.str(), std::string("lumo: warning: the segment is short\nlumo: warning: ") +
                               nova::ErrorCatalogueText(11) + "\n");
}

}  // namespace
