// RPC text forms: reading the bundled sample, round trips through both
// forms, producers' variants, every error path of the reader and the
// writer, and the tool's conversion and fit commands.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <memory>
#include <sstream>
#include <string>

#include "cli.h"
#include "lumo.h"
#include "model_io.h"
#include "nova/runtime.h"
#include "points_io.h"
#include "support/cli_runner.h"
#include "support/model_records.h"
#include "support/numbered_error.h"

namespace {

using RecordPtr = lumo::support::RfPtr;

const std::string kExamples = std::string(LUMO_SOURCE_DIR) + "/examples";

using lumo::support::ReadText;
using lumo::support::RunOk;

RecordPtr Parse(const std::string& text, int nForm = LUMO_RPC_TEXT_AUTO,
                std::vector<LumoRPCField>* paoFields = nullptr) {
    return RecordPtr(LumoRPCTextToRFInfo(text.data(), text.size(), nForm, "sample.txt", paoFields));
}

// The message of the exception a text raises ("" when it reads).
std::string ParseError(const std::string& text) {
    return lumo::support::DataErrorOf([&] { Parse(text); });
}

std::string WriteError(const RFInfo_t* psRF, int nForm,
                       const std::vector<LumoRPCField>& aoFields = {}) {
    return lumo::support::DataErrorOf([&] { LumoRFInfoToRPCText(psRF, nForm, aoFields); });
}

std::string Replace(std::string text, const std::string& from, const std::string& to) {
    const std::size_t at = text.find(from);
    EXPECT_NE(at, std::string::npos) << from;
    if (at != std::string::npos) text.replace(at, from.size(), to);
    return text;
}

void ExpectSameModel(const RFInfo_t& a, const RFInfo_t& b) {
    EXPECT_EQ(lumo::support::RfDifference(a, b), "");
}

TEST(RPCText, SampleFileReadsIntoTheModelsAxesAndFitsItsControlPoints) {
    const std::string text = ReadText(kExamples + "/rf_scene_RPC.TXT");
    EXPECT_EQ(LumoDetectRPCTextForm(text.data(), text.size()), LUMO_RPC_TEXT_TXT);
    RecordPtr psRF = Parse(text);
    EXPECT_STREQ(psRF->pszGeosys, "LON D000");
    // The control points come from the camera the model was fitted to, with
    // pixel (0, 0) the corner of the first pixel.
    const auto gcps = lumo::cli::ReadPointsFile(kExamples + "/rf_scene_gcps.csv",
                                                lumo::cli::PointKind::ControlPoint);
    ASSERT_EQ(gcps.asPoints.size(), 16u);
    for (const lumo::cli::PointRecord& g : gcps.asPoints) {
        double p = 0.0, l = 0.0;
        RFGeo2Img(psRF.get(), g.dfX, g.dfY, g.dfZ, &p, &l);
        EXPECT_NEAR(p, g.dfPixel, 0.01);
        EXPECT_NEAR(l, g.dfLine, 0.01);
    }
}

TEST(RPCText, BothFormsRoundTripExactly) {
    RecordPtr psRF = Parse(ReadText(kExamples + "/rf_scene_RPC.TXT"));
    std::strcpy(psRF->pszSensor, "PLEIADES 1A");
    const std::string rpb = LumoRFInfoToRPCText(psRF.get(), LUMO_RPC_TEXT_RPB);
    EXPECT_EQ(LumoDetectRPCTextForm(rpb.data(), rpb.size()), LUMO_RPC_TEXT_RPB);
    RecordPtr psFromRpb = Parse(rpb);
    ExpectSameModel(*psRF, *psFromRpb);
    EXPECT_STREQ(psFromRpb->pszSensor, "PLEIADES 1A");  // satId
    const std::string txt = LumoRFInfoToRPCText(psFromRpb.get(), LUMO_RPC_TEXT_TXT);
    ExpectSameModel(*psRF, *Parse(txt));
    EXPECT_EQ(LumoRFInfoToRPCText(Parse(txt).get(), LUMO_RPC_TEXT_TXT), txt);

    // Without the half-pixel shift the offsets move so that the model maps
    // the same way after the round trip.
    psRF->nHalfPixelShift = 0;
    RecordPtr psShifted = Parse(LumoRFInfoToRPCText(psRF.get(), LUMO_RPC_TEXT_TXT));
    EXPECT_EQ(psShifted->nHalfPixelShift, 1);
    double p1 = 0, l1 = 0, p2 = 0, l2 = 0;
    RFGeo2Img(psRF.get(), 7.5, 46.9, 700.0, &p1, &l1);
    RFGeo2Img(psShifted.get(), 7.5, 46.9, 700.0, &p2, &l2);
    EXPECT_NEAR(p1, p2, 1e-9);
    EXPECT_NEAR(l1, l2, 1e-9);

    // Fewer terms: the missing ones are written as 0.
    psRF->nTerms = 4;
    psRF->padfPixelNum[10] = 99.0;
    RecordPtr psShort = Parse(LumoRFInfoToRPCText(psRF.get(), LUMO_RPC_TEXT_RPB));
    EXPECT_EQ(psShort->padfPixelNum[3], psRF->padfPixelNum[3]);
    EXPECT_EQ(psShort->padfPixelNum[10], 0.0);
}

TEST(RPCText, TolerantOfLayoutVariants) {
    std::string text = ReadText(kExamples + "/rf_scene_RPC.TXT");
    RecordPtr psRF = Parse(text);
    // Windows line ends, lower-case keys, no units, extra vendor keys.
    std::string variant = "ERR_BIAS: 1.5\r\nERR_RAND: 0.2\r\n";
    std::istringstream in(text);
    std::string line;
    while (std::getline(in, line)) {
        for (char& ch : line) ch = static_cast<char>(std::tolower(static_cast<unsigned char>(ch)));
        const std::size_t unit = line.find(" pixels");
        if (unit != std::string::npos) line.erase(unit);
        variant += "  " + line + "\r\n\r\n";
    }
    ExpectSameModel(*psRF, *Parse(variant));
    // The block form accepts lists spread over lines in any way.
    std::string rpb = LumoRFInfoToRPCText(psRF.get(), LUMO_RPC_TEXT_RPB);
    rpb = Replace(rpb, "lineNumCoef = (\n", "lineNumCoef=(");
    ExpectSameModel(*psRF, *Parse(rpb));
}

TEST(RPCText, ReaderErrorsNameTheKeyAndLine) {
    const std::string text = ReadText(kExamples + "/rf_scene_RPC.TXT");
    RecordPtr psRF = Parse(text);
    const std::string rpb = LumoRFInfoToRPCText(psRF.get(), LUMO_RPC_TEXT_RPB);
    const std::string shortList = rpb.substr(0, rpb.rfind(",\n")) + ");\nEND_GROUP = IMAGE\nEND;\n";
    const std::pair<std::string, const char*> aCases[] = {
        {Replace(text, "LAT_SCALE: +0.11 degrees\n", ""), "key \"LAT_SCALE\" is missing"},
        {Replace(text, "+4961.5", "4961,5"), "line 1: key \"LINE_OFF\""},
        {Replace(text, "+5000 pixels\nSAMP", "0 pixels\nSAMP"),
         "line 6: key \"LINE_SCALE\": a scale must not be 0"},
        {Replace(text, "+46.95 degrees", "nan degrees"), "not a finite"},
        {Replace(text, "+7.45 degrees", "+7.45 degrees 3"), "LONG_OFF"},
        {text + "LINE_OFF: 3\n", "repeated (first given on line 1)"},
        {text + "LINE_NUM_COEFF_21: 3\n", "must lie in 1..20"},
        {Replace(text, "LINE_DEN_COEFF_7:", "LINE_DEN_COEFF_x:"), "LINE_DEN_COEFF_x"},
        {text + "garbage without colon\n", "expected \"KEY: value\""},
        {"", "not RPC text"},
        {shortList, "must hold 20 coefficients, found 19"},
        {Replace(rpb, "heightScale = +500;", "heightScale = +500 +1"), "key \"heightScale\""},
        {rpb.substr(0, rpb.size() - 30), "list not closed"},
        {Replace(rpb, "\tlatScale = +0.11;\n", ""), "\"latScale\" is missing"},
        {Replace(rpb, "sampNumCoef = (", "sampNumCoef = ["), "expected a list"},
        // A NUL inside a value is not part of a number.
        {Replace(text, "+800", std::string("+8\0000", 4)), "HEIGHT_OFF"},
    };
    for (const auto& [osText, pszFragment] : aCases) {
        EXPECT_NE(ParseError(osText).find(pszFragment), std::string::npos) << pszFragment;
    }
}

TEST(RPCText, WriterRefusesModelsWithoutAnRpcEquivalent) {
    RecordPtr psRF = Parse(ReadText(kExamples + "/rf_scene_RPC.TXT"));
    std::strcpy(psRF->pszGeosys, "UTM 31 U D000");
    EXPECT_NE(WriteError(psRF.get(), LUMO_RPC_TEXT_RPB).find("UTM 31 U D000"), std::string::npos);
    std::strcpy(psRF->pszGeosys, "LONG/LAT D000");
    psRF->padfLineDen[3] = INFINITY;
    EXPECT_NE(WriteError(psRF.get(), LUMO_RPC_TEXT_TXT).find("not finite"), std::string::npos);
    psRF->padfLineDen[3] = 0.0;
    psRF->dfZScale = 0.0;
    EXPECT_NE(WriteError(psRF.get(), LUMO_RPC_TEXT_TXT).find("HEIGHT_SCALE is 0"),
              std::string::npos);
    psRF->dfZScale = 1.0;
    EXPECT_NE(WriteError(psRF.get(), 7).find("unknown text form"), std::string::npos);
    EXPECT_NE(WriteError(nullptr, LUMO_RPC_TEXT_TXT), "");
    EXPECT_EQ(WriteError(psRF.get(), LUMO_RPC_TEXT_TXT), "");
}

// Producers' variants: statements without ';', and the fixed-width record
// with or without its validity flag and error estimates, line ends anywhere.
// Each reads into the model its values give.
TEST(RPCText, ProducerVariantsReadTheValuesTheyHold) {
    RecordPtr psSample = Parse(ReadText(kExamples + "/rf_scene_RPC.TXT"));
    std::string rpb = LumoRFInfoToRPCText(psSample.get(), LUMO_RPC_TEXT_RPB);
    rpb = "bandId = \"P\"\n" +
          Replace(rpb, "BEGIN_GROUP = IMAGE\n", "BEGIN_GROUP = IMAGE\nerrBias = 2.5;\n");
    std::string bare = rpb;
    bare.erase(std::remove(bare.begin(), bare.end(), ';'), bare.end());
    std::vector<LumoRPCField> aoFields;
    ExpectSameModel(*psSample, *Parse(bare, LUMO_RPC_TEXT_AUTO, &aoFields));
    ASSERT_EQ(aoFields.size(), 3u);  // bandId, SpecId, errBias
    EXPECT_EQ(aoFields[2].osKey, "errBias");
    EXPECT_EQ(aoFields[2].osValue, "2.5");

    // The fixed-width fields: pixel offsets and scales as integers, degrees
    // with four decimals, coefficients with seven digits and a one-digit
    // exponent. The expected model holds each value as written.
    RecordPtr psExpected = Parse(ReadText(kExamples + "/rf_scene_RPC.TXT"));
    double* pdf = &psExpected->dfXOffset;  // indices of the ten offsets and scales
    const std::pair<int, const char*> aScalars[] = {
        {8, "%06.0f"}, {6, "%05.0f"}, {2, "%+08.4f"}, {0, "%+09.4f"}, {4, "%+05.0f"},
        {9, "%06.0f"}, {7, "%05.0f"}, {3, "%+08.4f"}, {1, "%+09.4f"}, {5, "%+05.0f"}};
    std::string fixed;
    char field[32];
    for (const auto& [k, pszFormat] : aScalars) {
        std::snprintf(field, sizeof field, pszFormat, pdf[k]);
        fixed += field;
        pdf[k] = std::stod(field);
    }
    for (double* padf : {psExpected->padfLineNum, psExpected->padfLineDen, psExpected->padfPixelNum,
                         psExpected->padfPixelDen}) {
        for (int i = 0; i < 20; ++i) {
            std::snprintf(field, sizeof field, "%+.6E", padf[i]);
            std::string value = field;
            value.erase(value.size() - 2, 1);  // E-05 -> E-5
            ASSERT_EQ(value.size(), 12u) << value;
            fixed += value;
            padf[i] = std::stod(value);
        }
    }
    // Led by the validity flag, ERR_BIAS and ERR_RAND (seven characters each).
    std::string wrapped = "1" + std::string("0000.50") + "0002.25" + fixed;
    for (std::size_t at = 80; at < wrapped.size(); at += 81) wrapped.insert(at, "\r\n");
    for (const std::string& record : {fixed, wrapped + "\n"}) {
        EXPECT_EQ(LumoDetectRPCTextForm(record.data(), record.size()), LUMO_RPC_TEXT_FIXED);
        std::vector<LumoRPCField> aoFixedFields;
        ExpectSameModel(*psExpected, *Parse(record, LUMO_RPC_TEXT_AUTO, &aoFixedFields));
        EXPECT_EQ(aoFixedFields.size(), record == fixed ? 0u : 2u);
    }
    EXPECT_NE(ParseError("0" + wrapped.substr(1)).find("not usable"), std::string::npos);
    EXPECT_NE(ParseError(fixed.substr(1)).find("found 1025"), std::string::npos);
    EXPECT_NE(ParseError(Replace(fixed, "+", "+.")).find("characters"), std::string::npos);
}

// Fields beside the model survive TXT -> RPB -> TXT under each form's names;
// fields a form cannot write are refused, not dropped.
TEST(RPCText, FieldsSurviveConversionsBetweenForms) {
    const std::string text = "ERR_BIAS: 1.5 meters\nERR_RAND: 0.25 meters\nPRODUCT: ortho ready\n" +
                             ReadText(kExamples + "/rf_scene_RPC.TXT");
    std::vector<LumoRPCField> aoFields;
    RecordPtr psRF = Parse(text, LUMO_RPC_TEXT_TXT, &aoFields);
    const std::string rpb = LumoRFInfoToRPCText(psRF.get(), LUMO_RPC_TEXT_RPB, aoFields);
    EXPECT_NE(rpb.find("errBias = 1.5;"), std::string::npos);
    EXPECT_NE(rpb.find("PRODUCT = \"ortho ready\";"), std::string::npos);
    std::vector<LumoRPCField> aoBack;
    RecordPtr psBack = Parse(rpb, LUMO_RPC_TEXT_RPB, &aoBack);
    const std::string txt = LumoRFInfoToRPCText(psBack.get(), LUMO_RPC_TEXT_TXT, aoBack);
    for (const char* line : {"ERR_BIAS: 1.5 meters\n", "ERR_RAND: 0.25 meters\n",
                             "PRODUCT: ortho ready\n", "SpecId: RPC00B\n"}) {
        EXPECT_NE(txt.find(line), std::string::npos) << line;
    }
    aoFields.push_back({"bad key", "1", false});
    EXPECT_NE(WriteError(psRF.get(), LUMO_RPC_TEXT_RPB, aoFields).find("cannot be written"),
              std::string::npos);
}

TEST(RPCText, LongSatelliteNameIsCutToTheSensorBuffer) {
    RecordPtr psRF = Parse(ReadText(kExamples + "/rf_scene_RPC.TXT"));
    std::string rpb = LumoRFInfoToRPCText(psRF.get(), LUMO_RPC_TEXT_RPB);
    rpb = "satId = \"A-VERY-LONG-SATELLITE-NAME\";\n" + rpb;
    EXPECT_STREQ(Parse(rpb)->pszSensor, "A-VERY-LONG-SATE");
}

class RPCTextTool : public lumo::support::ScratchDirTest {
  protected:
    RPCTextTool() : ScratchDirTest("lumo_rpctext_") {}
};

// The tool converts through every form and the JSON model evaluates like
// the text it came from.
TEST_F(RPCTextTool, ConvertsBetweenAllForms) {
    const std::string dir = mDir.string();
    const std::string rpb = dir + "/h_scene.RPB", json = dir + "/h_scene.json";
    const std::string bin = dir + "/h_scene.bin", txt = dir + "/h_scene_RPC.TXT";
    const std::string sample = kExamples + "/rf_scene_RPC.TXT";
    RunOk({"rpc", sample, rpb});
    RunOk({"rpc", rpb, json, "--pixels", "10000", "--lines", "10000"});
    RunOk({"rpc", json, bin});
    RunOk({"rpc", bin, txt, "--to", "txt"});
    RecordPtr psSample = Parse(ReadText(sample));
    const lumo::cli::LoadedModel model = lumo::cli::ReadModelFile(json);
    EXPECT_EQ(model.nModelCode, LUMO_CODE_RF);
    EXPECT_EQ(model.sEnvelope.nPixels, 10000);
    ExpectSameModel(*psSample, *static_cast<RFInfo_t*>(model.poRecord.get()));
    // The block keeps 15 significant digits.
    EXPECT_EQ(lumo::support::RfDifference(*psSample, *Parse(ReadText(txt)), 1e-14), "");
    // The error estimates of a text go through JSON into the other text form;
    // the binary block says it cannot keep them.
    const std::string withErrors = dir + "/e_RPC.TXT", errJson = dir + "/e.json";
    std::ofstream(withErrors) << "ERR_BIAS: 3.5 meters\n" << ReadText(sample);
    RunOk({"rpc", withErrors, errJson});
    RunOk({"rpc", errJson, rpb});
    EXPECT_NE(ReadText(rpb).find("errBias = 3.5;"), std::string::npos);
    const std::string note = RunOk({"rpc", rpb, bin}).osErr;
    EXPECT_NE(note.find("no room for"), std::string::npos);
    EXPECT_NE(note.find("errBias"), std::string::npos);
}

// Rational polynomials fitted by the tool to a model are written in the
// form the output's name asks for, over the heights given.
TEST_F(RPCTextTool, FitsAModelInTheFormItsNameAsksFor) {
    const std::string dir = mDir.string();
    const std::string osModel = kExamples + "/srit_spot5_roll20.json";
    const lumo::support::RunResult sRun =
        RunOk({"rpc", "--fit", osModel, dir + "/scene_RPC.TXT", "--heights", "0", "1000"});
    EXPECT_NE(sRun.osOut.find("independent check grid: max"), std::string::npos) << sRun.osOut;
    RecordPtr psRF = Parse(ReadText(dir + "/scene_RPC.TXT"), LUMO_RPC_TEXT_TXT);
    EXPECT_NEAR(psRF->dfZOffset, 500.0, 1e-9);
    EXPECT_NEAR(psRF->dfZScale, 500.0, 1e-9);
    const lumo::support::RunResult sRadar =
        RunOk({"rpc", "--fit", kExamples + "/rtcs_scene.json", dir + "/radar.RPB"});
    EXPECT_NE(sRadar.osOut.find("(rtcs), 1000 x 1000 pixels"), std::string::npos) << sRadar.osOut;
    EXPECT_NEAR(Parse(ReadText(dir + "/radar.RPB"), LUMO_RPC_TEXT_RPB)->dfZOffset, 1000.0, 1e-9);
}

}  // namespace
