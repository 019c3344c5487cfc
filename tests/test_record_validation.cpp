// Every record type is validated on every read path: a model or segment that
// cannot be evaluated is refused with a message naming the field and value.
#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "lumo.h"
#include "model_io.h"
#include "nova/runtime.h"
#include "segment_io.h"
#include "support/cli_runner.h"

namespace {

using lumo::support::ReadText;
using nlohmann::json;

const std::string kExamples = std::string(LUMO_SOURCE_DIR) + "/examples/";

struct Spoil {
    std::function<void(json&)> change;
    std::string osExpected;  // part of the refusal, naming the field
};

// The example reads; each spoiled copy is refused naming the field.
void ExpectRefused(const std::string& osExample, const std::vector<Spoil>& spoils,
                   const std::function<void(const json&)>& read) {
    const json example = json::parse(ReadText(kExamples + osExample));
    EXPECT_NO_THROW(read(example)) << osExample;
    for (const Spoil& s : spoils) {
        json spoiled = example;
        s.change(spoiled);
        try {
            read(spoiled);
            ADD_FAILURE() << osExample << ": accepted, expected " << s.osExpected;
        } catch (const nova::DataException& e) {
            EXPECT_NE(std::string(e.what()).find(s.osExpected), std::string::npos) << e.what();
        }
    }
}

void ReadModelDocument(const json& document) {
    lumo::cli::ReadModel(document, "spoiled.json");
}

TEST(RecordValidation, ModelFilesOfEveryFamily) {
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
    ExpectRefused("tps_utm31.json",
                  {{[](json& d) { d["tps"]["imageToGeo"]["calculated"] = false; },
                    "psImageToGeo.bCalculated = 0"}},
                  ReadModelDocument);
    ExpectRefused("srit_spot5_roll20.json",
                  {{[](json& d) { d["srit"]["coefficients"][12] = 0; }, "adfCoef[12] = 0"},
                   {[](json& d) { d["srit"]["segment"]["nNumLines"] = -1; }, "nNumLines = -1"},
                   {[](json& d) { d["srit"]["elevationScale"] = "flat"; }, "found \"flat\""}},
                  ReadModelDocument);
    ExpectRefused("segment_optical_attitude.json",
                  {{[](json& d) { d["nNumLines"] = -1; }, "nNumLines = -1"},
                   {[](json& d) { d["nNumPixels"] = 2000000000; }, "nNumPixels = 2000000000"}},
                  [](const json& d) {
                      lumo::cli::SegmentFromJson(nlohmann::ordered_json::parse(d.dump()), "seg");
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

TEST(RecordValidation, RationalFunctionTextAndBlock) {
    // RPC text with a latitude offset outside the Earth.
    std::string text = ReadText(kExamples + "rf_scene_RPC.TXT");
    text.replace(text.find("LAT_OFF: +46.95"), 15, "LAT_OFF: +95.00");
    try {
        RFDeallocate(LumoRPCTextToRFInfo(text.data(), text.size(), LUMO_RPC_TEXT_AUTO, "bad.TXT"));
        ADD_FAILURE() << "accepted";
    } catch (const nova::DataException& e) {
        EXPECT_NE(std::string(e.what()).find("bad.TXT: the model cannot be evaluated: dfYOffset"),
                  std::string::npos)
            << e.what();
    }
    // A block whose scale reads 0 is refused, not turned into a model file.
    const auto model = lumo::cli::ReadModelFile(kExamples + "rf_scene.json");
    auto* psRF = static_cast<RFInfo_t*>(model.poRecord.get());
    psRF->dfLineScale = 0.0;
    int nLength = 0;
    std::unique_ptr<unsigned char, nova::FreeDeleter> block(LumoRFInfoToBinary(psRF, &nLength));
    ASSERT_NE(block, nullptr);
    const nova::ErrorSink previous = nova::SetErrorSink([](const nova::ErrorReport&) {});
    EXPECT_EQ(LumoBinaryToRFInfo(nLength, block.get()), nullptr);
    nova::SetErrorSink(previous);
    EXPECT_NE(nova::GetLastErrorReport().osText.find("dfLineScale = 0"), std::string::npos);
}

}  // namespace
