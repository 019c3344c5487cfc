// Control points written by other tools: a desktop GIS georeferencer's
// .points file and a plain "pixel line X Y Z" list fit the same model as the
// tool's own CSV file with the same points.
#include <gtest/gtest.h>

#include <sstream>
#include <string>

#include <nlohmann/json.hpp>

#include "points_io.h"
#include "support/cli_runner.h"

namespace {

const std::string kGcps = std::string(LUMO_SOURCE_DIR) + "/examples/poly_utm31_gcps.csv";

using lumo::support::ReadText;
using lumo::support::RunTool;

class GcpFormatsTest : public lumo::support::ScratchDirTest {
  protected:
    GcpFormatsTest() : ScratchDirTest("lumo_gcpformats_") {}

    nlohmann::json FitPoly(std::vector<std::string> extra, const std::string& gcps,
                           std::string* err) {
        std::vector<std::string> args = {"fit",    "--model", "poly", "--order",     "2",
                                         "--gcps", gcps,      "-o",   Path("m.json")};
        args.insert(args.end(), extra.begin(), extra.end());
        const auto r = RunTool(args);
        EXPECT_EQ(r.nCode, 0) << gcps << ": " << r.osErr;
        *err = r.osErr;
        return nlohmann::json::parse(ReadText(Path("m.json")))["poly"];
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
    const nlohmann::json own = FitPoly({"--geosys", "UTM 31 U D000"}, kGcps, &err);
    const nlohmann::json fromPoints = FitPoly({}, Write("g.points", points.str()), &err);
    EXPECT_EQ(fromPoints, own);
    EXPECT_NE(err.find("1 point is not enabled"), std::string::npos) << err;
    const std::string list = Write("g.txt", "# pixel line x y z\n" + plain.str());
    EXPECT_EQ(FitPoly({"--geosys", "EPSG:32631"}, list, &err), own);
    EXPECT_EQ(FitPoly({"--geosys", "EPSG:32631"},
                      Write("h.txt", "pixel line x y z\n" + plain.str()), &err),
              own);

    // The georeferencer's declaration also serves the datum conversion.
    const auto converted =
        RunTool({"gcps", "convert", "--height-ref", "E", "--height", "50", Path("g.points")});
    const auto reference = RunTool({"gcps", "convert", "--height-ref", "E", "--height", "50",
                                    "--geosys", "EPSG:32631", Write("c.csv", csv.str())});
    ASSERT_EQ(converted.nCode, 0) << converted.osErr;
    EXPECT_EQ(converted.osOut, reference.osOut);

    const auto binary =
        RunTool({"fit", "--model", "poly", "--geosys", "UTM 31 U D000", "--gcps",
                 Write("b.csv", std::string("PK\x03\x04\x00\x01", 6)), "-o", Path("b.json")});
    EXPECT_NE(binary.nCode, 0);
    EXPECT_NE(binary.osErr.find("holds binary data"), std::string::npos) << binary.osErr;
}

}  // namespace
