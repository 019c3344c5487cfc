// Control points and georeferencing written by other tools: a desktop GIS
// georeferencer's .points file, a plain "pixel line X Y Z" list, EPSG codes
// and PROJ strings fit the same model as the tool's own forms; UTM points
// far outside the latitude band their text names are warned about, and a
// point file's system is compared with --geosys as a system, not as text.
#include <gtest/gtest.h>

#include <sstream>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "points_io.h"
#include "support/cli_runner.h"

namespace {

const std::string kGcps = std::string(LUMO_SOURCE_DIR) + "/examples/poly_utm31_gcps.csv";

using lumo::support::ReadText;
using lumo::support::RunOk;

class GcpFormatsTest : public lumo::support::ScratchDirTest {
  protected:
    // The model file of a second-order fit, and the fit's messages in *err.
    nlohmann::json FitPoly(std::vector<std::string> extra, const std::string& gcps,
                           std::string* err) {
        std::vector<std::string> args = {"fit",    "--model", "poly", "--order",     "2",
                                         "--gcps", gcps,      "-o",   Path("m.json")};
        args.insert(args.end(), extra.begin(), extra.end());
        *err = RunOk(args).osErr;
        return nlohmann::json::parse(ReadText(Path("m.json")));
    }
};

TEST_F(GcpFormatsTest, OtherToolsFilesFitLikeTheToolsOwn) {
    const auto gcps = lumo::cli::ReadPointsFile(kGcps, lumo::cli::PointKind::ControlPoint);
    std::ostringstream points, plain, csv;
    csv << "pixel,line,x,y\n";
    points << "#CRS: PROJCS[\"WGS 84 / UTM zone 31N\",GEOGCS[\"WGS 84\",DATUM[\"WGS_1984\","
              "SPHEROID[\"WGS 84\",6378137,298.257223563]],PRIMEM[\"Greenwich\",0],"
              "UNIT[\"degree\",0.0174532925199433]],PROJECTION[\"Transverse_Mercator\"],"
              "PARAMETER[\"latitude_of_origin\",0],PARAMETER[\"central_meridian\",3],"
              "PARAMETER[\"scale_factor\",0.9996],PARAMETER[\"false_easting\",500000],"
              "PARAMETER[\"false_northing\",0],UNIT[\"metre\",1],AUTHORITY[\"EPSG\",\"32631\"]]\n"
           << "mapX,mapY,sourceX,sourceY,enable,dX,dY,residual\n"
           << "1,2,3,-4,0,0,0,0\n";  // not enabled: left out
    for (const auto& p : gcps.asPoints) {
        using lumo::cli::FormatDouble;
        points << FormatDouble(p.dfX) << "," << FormatDouble(p.dfY) << ","
               << FormatDouble(p.dfPixel) << "," << FormatDouble(-p.dfLine) << ",1,0,0,0\n";
        csv << FormatDouble(p.dfPixel) << "," << FormatDouble(p.dfLine) << ","
            << FormatDouble(p.dfX) << "," << FormatDouble(p.dfY) << "\n";
        plain << FormatDouble(p.dfPixel) << " \t" << FormatDouble(p.dfLine) << " "
              << FormatDouble(p.dfX) << " " << FormatDouble(p.dfY) << " " << FormatDouble(p.dfZ)
              << "\n";
    }
    std::string err;
    const nlohmann::json own = FitPoly({"--geosys", "UTM 31 U D000"}, kGcps, &err)["poly"];
    EXPECT_EQ(err, "");  // the points lie in the band their text names
    EXPECT_EQ(FitPoly({}, Write("g.points", points.str()), &err)["poly"], own);
    EXPECT_NE(err.find("1 point is not enabled"), std::string::npos) << err;
    const std::string list = Write("g.txt", "# pixel line x y z\n" + plain.str());
    EXPECT_EQ(FitPoly({"--geosys", "EPSG:32631"}, list, &err)["poly"], own);
    EXPECT_EQ(FitPoly({"--geosys", "EPSG:32631"},
                      Write("h.txt", "pixel line x y z\n" + plain.str()), &err)["poly"],
              own);

    // The georeferencer's declaration also serves the datum conversion.
    const auto converted =
        RunOk({"gcps", "convert", "--height-ref", "E", "--height", "50", Path("g.points")});
    const auto reference = RunOk({"gcps", "convert", "--height-ref", "E", "--height", "50",
                                  "--geosys", "EPSG:32631", Write("c.csv", csv.str())});
    EXPECT_EQ(converted.osOut, reference.osOut);

    // EPSG codes and PROJ strings where the tool takes a georeferencing text.
    for (const char* foreign : {"EPSG:32631", "+proj=utm +zone=31 +datum=WGS84"}) {
        const nlohmann::json model = FitPoly({"--geosys", foreign}, kGcps, &err);
        EXPECT_EQ(model["geosys"], "EPSG:32631") << foreign;
        EXPECT_EQ(model["poly"], own) << foreign;
    }
    // Band C lies near 76 S; the points are in France.
    FitPoly({"--geosys", "UTM 31 C D000"}, kGcps, &err);
    EXPECT_NE(err.find("far outside latitude band C"), std::string::npos) << err;
    EXPECT_NE(err.find("\"UTM 31 U D000\" or \"EPSG:32631\""), std::string::npos) << err;

    const auto byCode =
        RunOk({"gcps", "convert", "--geosys", "EPSG:32631", "--height-ref", "E", kGcps});
    const auto byText =
        RunOk({"gcps", "convert", "--geosys", "UTM 31 U D000", "--height-ref", "E", kGcps});
    EXPECT_EQ(byCode.osOut, byText.osOut);
}

// One system under two texts is no contradiction; two systems are.
TEST_F(GcpFormatsTest, PointFileSystemComparedBySystemNotText) {
    const std::string model = std::string(LUMO_SOURCE_DIR) + "/examples/rf_scene.json";
    const auto Transform = [&](const char* declared, const char* x, const char* y,
                               const char* given) {
        const std::string points = Write("g.csv", std::string("# geosys: ") + declared +
                                                      "\nid,x,y,z\nA," + x + "," + y + ",450\n");
        return lumo::support::RunTool(
            {"transform", model, "--to-image", points, "--geosys", given});
    };
    const auto byText = Transform("LONG/LAT D000", "7.3412", "46.8752", "LONG/LAT D000");
    const auto byCode = Transform("LONG/LAT D000", "7.3412", "46.8752", "EPSG:4326");
    EXPECT_EQ(byCode.nCode, 0) << byCode.osErr;
    EXPECT_EQ(byCode.osOut.substr(byCode.osOut.find('\n')),
              byText.osOut.substr(byText.osOut.find('\n')));
    EXPECT_EQ(Transform("UTM 32 D000", "380000", "5190000", "EPSG:32632").nCode, 0);
    const auto other = Transform("UTM 32 D000", "380000", "5190000", "EPSG:32633");
    EXPECT_EQ(other.nCode, 1);
    EXPECT_NE(other.osErr.find("contradicts"), std::string::npos) << other.osErr;
}

}  // namespace
