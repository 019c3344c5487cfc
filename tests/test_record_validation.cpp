// Every record type is validated on every read path: a model or segment that
// cannot be evaluated, or a file field that cannot be read, is refused with a
// message naming the file, the field and the value.
#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "lumo.h"
#include "model_io.h"
#include "nova/runtime.h"
#include "segment_io.h"
#include "support/cli_runner.h"
#include "support/numbered_error.h"

namespace {

using lumo::support::ReadText;
using nlohmann::json;

const std::string kExamples = std::string(LUMO_SOURCE_DIR) + "/examples/";

struct Spoil {
    std::function<void(json&)> change;
    std::string osExpected;  // part of the refusal, naming the field
};

// The example reads; each spoiled copy is refused naming the file and field.
void ExpectRefused(const std::string& osExample, const std::vector<Spoil>& spoils,
                   const std::function<void(const json&)>& read) {
    const json example = json::parse(ReadText(kExamples + osExample));
    EXPECT_NO_THROW(read(example)) << osExample;
    for (const Spoil& s : spoils) {
        json spoiled = example;
        s.change(spoiled);
        const std::string osError = lumo::support::DataErrorOf([&] { read(spoiled); });
        EXPECT_NE(osError.find("spoiled"), std::string::npos) << osExample << ": " << osError;
        EXPECT_NE(osError.find(s.osExpected), std::string::npos) << osError;
    }
}

void ReadModelDocument(const json& document) {
    lumo::cli::ReadModel(document, "spoiled.json");
}

TEST(RecordValidation, ModelFilesOfEveryFamily) {
    // One case per kind of fault of the model file's envelope and fields.
    ExpectRefused(
        "poly_utm31.json",
        {{[](json& d) { d.erase("geosys"); }, "\"geosys\" is missing"},
         {[](json& d) { d["version"] = 2; }, "\"version\" must lie in 1..1"},
         {[](json& d) { d["family"] = "nope"; }, "unknown model family \"nope\""},
         {[](json& d) { d["poly"]["nCoeffs"] = 22; }, "\"poly.nCoeffs\" must lie in 1..21"},
         {[](json& d) { d["poly"]["pixelCoeffs"].erase(0); },
          "\"poly.pixelCoeffs\" must hold 10 numbers (nCoeffs), found 9"},
         {[](json& d) { d["poly"]["yCoeffs"][3] = "x"; }, "\"poly.yCoeffs\" item 3 must be"},
         {[](json& d) { d["geosys"] = "UTM 31 U D000 EXTRA"; }, "longer than 16"},
         {[](json& d) { d["geosys"] = "NOWHERE 99"; }, "\"NOWHERE 99\" cannot be used"}},
        ReadModelDocument);
    ExpectRefused("rf_scene.json",
                  {{[](json& d) { d["rf"]["lineDen"] = std::vector<double>(20, 0.0); },
                    "padfLineDen: every coefficient is 0"},
                   {[](json& d) { d["rf"]["xScale"] = -1e308; }, "dfXScale = -1e+308"},
                   {[](json& d) { d["rf"]["yOffset"] = 95; }, "dfYOffset = 95"},
                   {[](json& d) { d["rf"]["zScale"] = 0; }, "dfZScale = 0"},
                   {[](json& d) { d["rf"]["pixelDen"][1] = 3.0; }, "changes sign"},
                   {[](json& d) { d["rf"]["lineNum"][0] = 1e7; }, "not a bounded image"}},
                  ReadModelDocument);
    ExpectRefused("ap_frame_utm31.json",
                  {{[](json& d) { d["ap"]["photoToImage"] = std::vector<double>(8, 1.0); },
                    "adfPhotoToImage determinant = 0"},
                   {[](json& d) { d["ap"]["camera"][2] = -10; }, "dfCameraZ = -10"}},
                  ReadModelDocument);
    ExpectRefused(
        "tps_utm31.json",
        {{[](json& d) { d["tps"]["imageToGeo"]["calculated"] = false; },
          "psImageToGeo.bCalculated = 0"},
         {[](json& d) { d["tps"].erase("imageToGeo"); }, "field \"tps.imageToGeo\" is missing"},
         {[](json& d) { d["tps"]["geoToImage"]["coefX"].erase(0); },
          "field \"tps.geoToImage.coefX\" must hold 18 numbers, found 17"},
         {[](json& d) { d["tps"]["geoToImage"]["nCPs"] = 3; },
          "field \"tps.geoToImage.nCPs\" must be 0 (an affine spline) or at least 4, found 3"},
         {[](json& d) { d["tps"]["imageToGeo"]["cpY"][3] = "x"; },
          "field \"tps.imageToGeo.cpY\" item 3 must be a finite number, found \"x\""}},
        ReadModelDocument);
    ExpectRefused("srit_spot5_roll20.json",
                  {{[](json& d) { d["srit"]["coefficients"][0] = 0; }, "adfCoef[0] = 0"},
                   {[](json& d) { d["srit"]["coefficients"][12] = 0; }, "adfCoef[12] = 0"},
                   {[](json& d) { d["srit"]["segment"]["nNumLines"] = -1; }, "nNumLines = -1"},
                   {[](json& d) { d["srit"]["elevationScale"] = "flat"; }, "found \"flat\""}},
                  ReadModelDocument);
    ExpectRefused("segment_optical_attitude.json",
                  {{[](json& d) { d["nNumLines"] = -1; }, "nNumLines = -1"},
                   {[](json& d) { d["nNumPixels"] = 2000000000; }, "nNumPixels = 2000000000"}},
                  [](const json& d) {
                      lumo::cli::SegmentFromJson(nlohmann::ordered_json::parse(d.dump()),
                                                 "spoiled");
                  });
    // Records that no file reader could build are refused by the library.
    lumo::cli::PolyPtr poly(POLYAllocate());
    EXPECT_NE(POLYValidate(poly.get()).find("nCoeffs = 0"), std::string::npos);
    EXPECT_NE(EphemerisSegValidate(nullptr), "");
}

// A record no reader accepts, handed straight to the transforms, gives
// failures and the null value, never NaN reported as a position.
TEST(RecordValidation, UnreadableRigorousRecordGivesNoPositions) {
    const auto model = lumo::cli::ReadModelFile(kExamples + "srit_spot5_roll20.json");
    auto* psModel = static_cast<SRITInfo_t*>(model.poRecord.get());
    const double x0 = psModel->adfCoef[16], y0 = psModel->adfCoef[17];
    psModel->adfCoef[0] = 0.0;  // no Earth radius
    double z = 0.0, x = 0.0, y = 0.0, p = 0.0, l = 0.0;
    EXPECT_EQ(SRITImg2GeoDem(psModel, 100.0, 100.0, &z, &x, &y), 0);
    EXPECT_EQ(GenImg2Geo(LUMO_CODE_SRIT, psModel, 100.0, 100.0, 0.0, &x, &y), 0);
    EXPECT_EQ(x, LUMO_NULL_VALUE);
    SRITGeo2Img(psModel, x0, y0, 0.0, &p, &l);
    EXPECT_EQ(p, LUMO_NULL_VALUE);
    EXPECT_EQ(SRITGeo2ImgExact(psModel, x0, y0, 0.0, &p, &l), 0);
}

}  // namespace
