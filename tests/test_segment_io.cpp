// Ephemeris segment files: bit-exact write/read of every field and sub-record
// kind, the reader's error for each kind of bad input, and `lumo segment`.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <limits>
#include <string>
#include <vector>

#include "cli.h"
#include "lumo.h"
#include "runtime.h"
#include "segment_io.h"
#include "support/cli_runner.h"
#include "support/numbered_error.h"
#include "support/segments.h"

namespace {

using lumo::cli::SegmentPtr;
using lumo::support::DataErrorOf;
using lumo::support::ExpectSameSegment;
using lumo::support::RandomSegment;
using lumo::support::Zeroed;
using Json = nlohmann::ordered_json;

std::string TempPath(const char* pszName) {
    return std::string(::testing::TempDir()) + "lumo_segment_" + pszName;
}

// Every kind through a file and back; a truncated file and a missing one
// are refused.
TEST(SegmentFile, EveryFieldRoundTripsBitExactly) {
    const std::string osPath = TempPath("round_trip.json");
    for (int nKind : {0, 1, 2, 3}) {
        SCOPED_TRACE("kind " + std::to_string(nKind));
        const SegmentPtr poSrc = RandomSegment(nKind, 7, 1000u + nKind);
        lumo::cli::WriteSegmentFile(osPath, *poSrc);
        const SegmentPtr poBack = lumo::cli::ReadSegmentFile(osPath);
        ExpectSameSegment(*poSrc, *poBack);
        EXPECT_EQ(poBack->nOrbitType, nKind);
    }
    std::ofstream(osPath) << "{\"format\": \"lumo-segment\", ";
    EXPECT_THROW(lumo::cli::ReadSegmentFile(osPath), nova::DataException);
    std::remove(osPath.c_str());
    EXPECT_THROW(lumo::cli::ReadSegmentFile(osPath), nova::DataException);
}

TEST(SegmentFile, SpecialValuesAndTexts) {
    SegmentPtr poSeg(Zeroed<EphemerisSeg_t>());
    poSeg->dfPixelRes = std::numeric_limits<double>::quiet_NaN();
    std::strcpy(poSeg->szHeaderText1, "Caf\xE9 \xFF");
    const Json document = lumo::cli::SegmentToJson(*poSeg);
    EXPECT_EQ(document["dfPixelRes"], "NaN");
    EXPECT_EQ(document["szHeaderText1"], "Caf\xC3\xA9 \xC3\xBF");
    EXPECT_FALSE(document.contains("orbitData"));
    const SegmentPtr poBack = lumo::cli::SegmentFromJson(document, "memory");
    EXPECT_TRUE(std::isnan(poBack->dfPixelRes));
    EXPECT_STREQ(poBack->szHeaderText1, "Caf\xE9 \xFF");

    // A document with nothing but a kind gives a zero-filled segment of that
    // kind without sub-record; a sub-record may come without lines.
    const SegmentPtr poKindOnly = lumo::cli::SegmentFromJson(
        Json::parse(R"({"format": "lumo-segment", "version": 1, "nOrbitType": 5})"), "memory");
    EXPECT_EQ(poKindOnly->nOrbitType, 5);
    EXPECT_EQ(poKindOnly->ppOrbitData, nullptr);
    EXPECT_EQ(poKindOnly->szSensorName[0], '\0');
    const SegmentPtr poNoLines = lumo::cli::SegmentFromJson(
        Json::parse(R"({"format": "lumo-segment", "version": 1, "nOrbitType": 3,
                        "orbitData": {"szSemiMajorAxis": "72290000"}})"),
        "memory");
    const auto* psAvhrr = static_cast<const AvhrrData_t*>(*poNoLines->ppOrbitData);
    EXPECT_STREQ(psAvhrr->szSemiMajorAxis, "72290000");
    EXPECT_EQ(psAvhrr->nNumScanLines, 0);
    EXPECT_EQ(psAvhrr->pScanLines, nullptr);
}

// The writer never follows a count that disagrees with its array, and a text
// without a terminator is refused rather than overrun.
TEST(SegmentFile, WriterFaults) {
    SegmentPtr poSeg = RandomSegment(EPH_ORBIT_RADAR, 2, 5u);
    auto* psRadar = static_cast<RadarData_t*>(*poSeg->ppOrbitData);
    psRadar->nNumLinePositions = -3;
    Json document = lumo::cli::SegmentToJson(*poSeg);
    EXPECT_EQ(document["orbitData"]["nNumLinePositions"], 0);
    EXPECT_TRUE(document["orbitData"]["pLinePositions"].empty());
    std::free(psRadar->pLinePositions);
    psRadar->pLinePositions = nullptr;
    psRadar->nNumLinePositions = 1000;
    document = lumo::cli::SegmentToJson(*poSeg);
    EXPECT_EQ(document["orbitData"]["nNumLinePositions"], 0);

    std::memset(poSeg->szSensorName, 'A', sizeof(poSeg->szSensorName));
    EXPECT_NE(DataErrorOf([&] { lumo::cli::SegmentToJson(*poSeg); }).find("\"szSensorName\""),
              std::string::npos);
}

// Every reader error names the field (with its position in arrays): the
// header's, then those of fields after a valid header.
TEST(SegmentFile, ReaderErrorsNameTheField) {
    const auto fnExpectRefused = [](const std::string& osJson, const std::string& osField) {
        const std::string osMessage = DataErrorOf(
            [&] { lumo::cli::SegmentFromJson(Json::parse("{" + osJson + "}"), "case.json"); });
        EXPECT_EQ(osMessage.rfind("case.json: ", 0), 0u) << osJson << ": " << osMessage;
        EXPECT_NE(osMessage.find(osField), std::string::npos) << osField << " in: " << osMessage;
    };
    fnExpectRefused(R"("version": 1)", "format");
    fnExpectRefused(R"("format": "lumo-segment")", "version");
    fnExpectRefused(R"("format": "lumo-segment", "version": 2)", "version");
    const std::pair<const char*, const char*> aFields[] = {
        {R"("szSensorNam": "X")", "szSensorNam"},
        {R"("szSensorName": "ABCDEFGHIJKLMNOPQ")", "szSensorName"},
        {R"("szGeosys": "\u0100")", "szGeosys"},
        {R"("nNumLines": 1.5)", "nNumLines"},
        {R"("nNumLines": -1)", "nNumLines = -1"},
        {R"("bCarriedFlag": 256)", "bCarriedFlag"},
        {R"("dfPixelRes": "five")", "dfPixelRes"},
        {R"("adfCarriedB": [1, 2, 3])", "adfCarriedB"},
        {R"("anLevelConvParams": [1, 2, "x", 4])", "anLevelConvParams[2]"},
        {R"("nLevelConvForm": 7)", "nLevelConvForm"},
        {R"("nOrbitType": 5, "orbitData": {})", "orbitData"},
        {R"("nOrbitType": 1, "orbitData": {"dfAttitude4": 1})", "orbitData.dfAttitude4"},
        {R"("nOrbitType": 1, "orbitData": {"pAttitudeLines": [[1, 2], [3]]})",
         "orbitData.pAttitudeLines[1]"},
        {R"("nOrbitType": 1, "orbitData": {"nNumAttitudeLines": 3, "pAttitudeLines": [[1, 2]]})",
         "orbitData.nNumAttitudeLines"},
        {R"("nOrbitType": 2, "orbitData": {"pLinePositions": [[1, 2, 3, 4, 5, 6, 7, 1e39]]})",
         "orbitData.pLinePositions[0].fLonLast"},
        {R"("nOrbitType": 2, "orbitData": {"abyLeading": "00ff"})", "orbitData.abyLeading"},
        {R"("nOrbitType": 3, "orbitData": {"pScanLines": [[0, 1, "", [1, 2, 3, 4, 5, 6, 700], ""]]})",
         "orbitData.pScanLines[0].abyTimeCode[6]"},
    };
    for (const auto& c : aFields) {
        fnExpectRefused(std::string(R"("format": "lumo-segment", "version": 1, )") + c.first,
                        c.second);
    }
    EXPECT_THROW(lumo::cli::SegmentFromJson(Json::array(), "case.json"), nova::DataException);
}

TEST(SegmentCommand, DescribesCopiesAndPrintsTheExamples) {
    using lumo::support::RunOk;
    const std::string osExamples = std::string(LUMO_SOURCE_DIR) + "/examples/";
    auto r = RunOk({"segment", osExamples + "segment_optical_attitude.json"});
    EXPECT_NE(r.osOut.find("sensor code 55, model class 1"), std::string::npos) << r.osOut;
    EXPECT_NE(r.osOut.find("kind 1 (attitude), 24 lines"), std::string::npos) << r.osOut;

    const std::string osCopy = TempPath("radar_copy.json");
    r = RunOk({"segment", osExamples + "segment_radar_lines.json", "-o", osCopy});
    EXPECT_NE(r.osOut.find("sensor code 26, model class 3"), std::string::npos) << r.osOut;
    ExpectSameSegment(*lumo::cli::ReadSegmentFile(osExamples + "segment_radar_lines.json"),
                      *lumo::cli::ReadSegmentFile(osCopy));
    std::remove(osCopy.c_str());

    r = RunOk({"segment", osExamples + "segment_radar_lines.json", "--json"});
    EXPECT_EQ(Json::parse(r.osOut)["orbitData"]["nNumLinePositions"], 12);
}

}  // namespace
