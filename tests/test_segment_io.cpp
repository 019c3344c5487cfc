// Ephemeris segment files: bit-exact write/read of every field and sub-record
// kind, the reader's error for each kind of bad input, and `lumo segment`.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <limits>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include "cli.h"
#include "lumo.h"
#include "runtime.h"
#include "segment_io.h"

namespace {

using lumo::cli::SegmentPtr;
using Json = nlohmann::ordered_json;

template <typename T>
T* Zeroed(std::size_t nCount = 1) {
    return static_cast<T*>(HCalloc(nCount, sizeof(T)));
}

// Random values that survive a text round trip: any finite or infinite
// double (no NaN, whose payload the file does not keep), any byte.
class Filler {
  public:
    explicit Filler(unsigned nSeed) : moEngine(nSeed) {}

    double Double() {
        const std::uint64_t nBits = moEngine();
        double dfValue = 0;
        std::memcpy(&dfValue, &nBits, sizeof(dfValue));
        return std::isnan(dfValue) ? -0.0 : dfValue;
    }
    float Float() {
        const auto nBits = static_cast<std::uint32_t>(moEngine());
        float fValue = 0;
        std::memcpy(&fValue, &nBits, sizeof(fValue));
        return std::isnan(fValue) ? std::numeric_limits<float>::denorm_min() : fValue;
    }
    int32_t Int() { return static_cast<int32_t>(moEngine()); }
    uint8_t Byte() { return static_cast<uint8_t>(moEngine()); }
    // A full-length text of any non-NUL bytes.
    void Text(char* pszOut, std::size_t nSize) {
        for (std::size_t i = 0; i + 1 < nSize; ++i) {
            pszOut[i] = static_cast<char>(1 + moEngine() % 255);
        }
        pszOut[nSize - 1] = '\0';
    }
    void Bytes(uint8_t* pabyOut, std::size_t nCount) {
        for (std::size_t i = 0; i < nCount; ++i) pabyOut[i] = Byte();
    }

  private:
    std::mt19937_64 moEngine;
};

SegmentPtr RandomMainRecord(Filler& r) {
    SegmentPtr poSeg(Zeroed<EphemerisSeg_t>());
    EphemerisSeg_t& s = *poSeg;
    r.Text(s.szHeaderText1, sizeof(s.szHeaderText1));
    r.Text(s.szHeaderText2, sizeof(s.szHeaderText2));
    r.Text(s.szSensorName, sizeof(s.szSensorName));
    r.Text(s.szSensorExtra, sizeof(s.szSensorExtra));
    r.Text(s.szAcquisitionDate, sizeof(s.szAcquisitionDate));
    s.nSupplementFlag = r.Int();
    for (double* pdf :
         {&s.dfIFOV,        &s.dfViewAngle,      &s.dfCentreColumn,     &s.dfCentreLine,
          &s.dfSatVelocity, &s.dfAngularSpeed,   &s.dfOrbitSpare1,      &s.dfSatHeight,
          &s.dfInclination, &s.dfLineInterval,   &s.dfAscNodeLongitude, &s.dfPerigeeArgument,
          &s.dfOrbitSpare2, &s.dfCentreLatitude, &s.dfOrbitRadius,      &s.dfPitchAngle,
          &s.dfOrbitSpare3, &s.dfOrbitSpare4,    &s.dfPixelRes,         &s.dfLineRes,
          &s.dfAvgHeight}) {
        *pdf = r.Double();
    }
    r.Text(s.szGeosys, sizeof(s.szGeosys));
    s.bCarriedFlag = r.Byte();
    s.nCarried1 = r.Int();
    for (double& df : s.adfCarriedA) df = r.Double();
    for (double& df : s.adfCarriedB) df = r.Double();
    s.nLevelConvForm = 39;
    for (int32_t& n : s.anLevelConvParams) n = r.Int();
    for (double& df : s.adfLevelConvCoefs) df = r.Double();
    for (int32_t* pn : {&s.nBytesPerRecord, &s.nNumLines, &s.nBytesPerPixel, &s.nNumPixels,
                        &s.nPrefixBytes, &s.nSuffixBytes, &s.nCarried2}) {
        *pn = r.Int();
    }
    // Special values that must come back exactly.
    s.dfIFOV = std::numeric_limits<double>::denorm_min();
    s.dfViewAngle = -0.0;
    s.dfSatHeight = std::numeric_limits<double>::infinity();
    s.dfOrbitSpare1 = -std::numeric_limits<double>::infinity();
    s.dfOrbitRadius = std::numeric_limits<double>::max();
    s.dfCentreLatitude = 0.1;
    return poSeg;
}

void Attach(EphemerisSeg_t* psSeg, int nKind, void* pvSub) {
    psSeg->nOrbitType = nKind;
    psSeg->ppOrbitData = Zeroed<void*>();
    *psSeg->ppOrbitData = pvSub;
}

SegmentPtr RandomSegment(int nKind, int nLines, unsigned nSeed) {
    Filler r(nSeed);
    SegmentPtr poSeg = RandomMainRecord(r);
    if (nKind == EPH_ORBIT_ATTITUDE) {
        auto* psAtt = Zeroed<AttitudeData_t>();
        psAtt->dfAttitude1 = r.Double();
        psAtt->dfAttitude2 = r.Double();
        psAtt->dfAttitude3 = r.Double();
        psAtt->nNumAttitudeLines = nLines;
        psAtt->pAttitudeLines = Zeroed<AttitudeLine_t>(nLines);
        for (int i = 0; i < nLines; ++i) psAtt->pAttitudeLines[i] = {r.Double(), r.Double()};
        Attach(poSeg.get(), nKind, psAtt);
    } else if (nKind == EPH_ORBIT_RADAR) {
        auto* psRadar = Zeroed<RadarData_t>();
        r.Bytes(psRadar->abyLeading, sizeof(psRadar->abyLeading));
        psRadar->nNumLinePositions = nLines;
        psRadar->pLinePositions = Zeroed<RadarLine_t>(nLines);
        for (int i = 0; i < nLines; ++i) {
            psRadar->pLinePositions[i] = {r.Int(),   r.Int(),   r.Float(), r.Float(),
                                          r.Float(), r.Float(), r.Float(), r.Float()};
        }
        Attach(poSeg.get(), nKind, psRadar);
    } else if (nKind == EPH_ORBIT_AVHRR) {
        auto* psAvhrr = Zeroed<AvhrrData_t>();
        r.Bytes(psAvhrr->abyLeading, sizeof(psAvhrr->abyLeading));
        psAvhrr->nTimeDirection = r.Int();
        char* pszFirst = psAvhrr->szField1;
        for (int k = 0; k < 26; ++k) r.Text(pszFirst + k * AVHRR_FIELD_SIZE, AVHRR_FIELD_SIZE);
        psAvhrr->nNumScanLines = nLines;
        psAvhrr->pScanLines = Zeroed<AvhrrLine_t>(nLines);
        for (int i = 0; i < nLines; ++i) {
            AvhrrLine_t& sLine = psAvhrr->pScanLines[i];
            sLine.nCarried = r.Int();
            sLine.nTimeMs = r.Int();
            r.Bytes(sLine.abyCarriedA, sizeof(sLine.abyCarriedA));
            r.Bytes(sLine.abyTimeCode, sizeof(sLine.abyTimeCode));
            r.Bytes(sLine.abyCarriedB, sizeof(sLine.abyCarriedB));
        }
        Attach(poSeg.get(), nKind, psAvhrr);
    }
    return poSeg;
}

bool SameBytes(const void* pvA, const void* pvB, std::size_t nSize) {
    return std::memcmp(pvA, pvB, nSize) == 0;
}

// Compares records byte for byte with their pointers set aside (both come
// from zero-filled blocks, so padding agrees too).
template <typename T, typename Line>
void ExpectSameSub(const void* pvA, const void* pvB, Line* T::*ppLines, int32_t T::*pnCount) {
    T sA;
    T sB;
    std::memcpy(&sA, pvA, sizeof(T));
    std::memcpy(&sB, pvB, sizeof(T));
    ASSERT_EQ(sA.*pnCount, sB.*pnCount);
    ASSERT_NE(sB.*ppLines, nullptr);
    EXPECT_TRUE(SameBytes(sA.*ppLines, sB.*ppLines, sizeof(Line) * sA.*pnCount));
    sA.*ppLines = nullptr;
    sB.*ppLines = nullptr;
    EXPECT_TRUE(SameBytes(&sA, &sB, sizeof(T)));
}

void ExpectSameSegment(const EphemerisSeg_t& sA, const EphemerisSeg_t& sB) {
    EphemerisSeg_t sMainA;
    EphemerisSeg_t sMainB;
    std::memcpy(&sMainA, &sA, sizeof(sMainA));
    std::memcpy(&sMainB, &sB, sizeof(sMainB));
    sMainA.ppOrbitData = nullptr;
    sMainB.ppOrbitData = nullptr;
    EXPECT_TRUE(SameBytes(&sMainA, &sMainB, sizeof(sMainA)));
    ASSERT_EQ(sA.ppOrbitData == nullptr, sB.ppOrbitData == nullptr);
    if (sA.ppOrbitData == nullptr) return;
    switch (sA.nOrbitType) {
        case EPH_ORBIT_ATTITUDE:
            ExpectSameSub(*sA.ppOrbitData, *sB.ppOrbitData, &AttitudeData_t::pAttitudeLines,
                          &AttitudeData_t::nNumAttitudeLines);
            break;
        case EPH_ORBIT_RADAR:
            ExpectSameSub(*sA.ppOrbitData, *sB.ppOrbitData, &RadarData_t::pLinePositions,
                          &RadarData_t::nNumLinePositions);
            break;
        case EPH_ORBIT_AVHRR:
            ExpectSameSub(*sA.ppOrbitData, *sB.ppOrbitData, &AvhrrData_t::pScanLines,
                          &AvhrrData_t::nNumScanLines);
            break;
        default:
            FAIL() << "unexpected kind " << sA.nOrbitType;
    }
}

std::string TempPath(const char* pszName) {
    return std::string(::testing::TempDir()) + "lumo_segment_" + pszName;
}

TEST(SegmentFile, EveryFieldRoundTripsBitExactly) {
    for (int nKind : {0, 1, 2, 3}) {
        SCOPED_TRACE("kind " + std::to_string(nKind));
        const SegmentPtr poSrc = RandomSegment(nKind, 7, 1000u + nKind);
        const Json document = lumo::cli::SegmentToJson(*poSrc);
        // Through the text form, as a file would carry it.
        const Json reparsed = Json::parse(lumo::cli::FormatSegmentJson(document));
        const SegmentPtr poBack = lumo::cli::SegmentFromJson(reparsed, "memory");
        ExpectSameSegment(*poSrc, *poBack);
        EXPECT_EQ(poBack->nOrbitType, nKind);
    }
}

TEST(SegmentFile, WriteAndReadAFile) {
    const SegmentPtr poSrc = RandomSegment(EPH_ORBIT_AVHRR, 3, 77u);
    const std::string osPath = TempPath("avhrr.json");
    lumo::cli::WriteSegmentFile(osPath, *poSrc);
    const SegmentPtr poBack = lumo::cli::ReadSegmentFile(osPath);
    ExpectSameSegment(*poSrc, *poBack);
    std::remove(osPath.c_str());
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

    // A minimal document gives a zero-filled segment.
    const SegmentPtr poEmpty = lumo::cli::SegmentFromJson(
        Json::parse(R"({"format": "lumo-segment", "version": 1})"), "memory");
    EXPECT_EQ(poEmpty->nOrbitType, 0);
    EXPECT_EQ(poEmpty->ppOrbitData, nullptr);
    EXPECT_EQ(poEmpty->szSensorName[0], '\0');

    // A kind without sub-record, and a sub-record without lines.
    const SegmentPtr poKindOnly = lumo::cli::SegmentFromJson(
        Json::parse(R"({"format": "lumo-segment", "version": 1, "nOrbitType": 5})"), "memory");
    EXPECT_EQ(poKindOnly->nOrbitType, 5);
    EXPECT_EQ(poKindOnly->ppOrbitData, nullptr);
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
    try {
        lumo::cli::SegmentToJson(*poSeg);
        FAIL() << "an unterminated text was written";
    } catch (const nova::DataException& e) {
        EXPECT_NE(std::string(e.what()).find("\"szSensorName\""), std::string::npos) << e.what();
    }
}

struct BadDocument {
    const char* pszJson;
    const char* pszField;  // must appear, quoted, in the message
};

// Every reader error names the field (with its position in arrays).
TEST(SegmentFile, ReaderErrorsNameTheField) {
    const BadDocument aCases[] = {
        {R"("version": 1)", "format"},
        {R"("format": "lumo-model", "version": 1)", "format"},
        {R"("format": "lumo-segment")", "version"},
        {R"("format": "lumo-segment", "version": 2)", "version"},
        {R"("format": "lumo-segment", "version": "1")", "version"},
        {R"("format": "lumo-segment", "version": 1, "szSensorNam": "X")", "szSensorNam"},
        {R"("format": "lumo-segment", "version": 1, "szSensorName": 12)", "szSensorName"},
        {R"("format": "lumo-segment", "version": 1, "szSensorName": "ABCDEFGHIJKLMNOPQ")",
         "szSensorName"},
        {R"("format": "lumo-segment", "version": 1, "szSensorExtra": "ABC")", "szSensorExtra"},
        {R"("format": "lumo-segment", "version": 1, "szGeosys": "\u0100")", "szGeosys"},
        {R"("format": "lumo-segment", "version": 1, "szGeosys": "A\u0000B")", "szGeosys"},
        {R"("format": "lumo-segment", "version": 1, "nNumLines": 1.5)", "nNumLines"},
        {R"("format": "lumo-segment", "version": 1, "nNumLines": 2147483648)", "nNumLines"},
        {R"("format": "lumo-segment", "version": 1, "nNumLines": 18446744073709551615)",
         "nNumLines"},
        {R"("format": "lumo-segment", "version": 1, "nNumLines": "12")", "nNumLines"},
        {R"("format": "lumo-segment", "version": 1, "bCarriedFlag": 256)", "bCarriedFlag"},
        {R"("format": "lumo-segment", "version": 1, "dfPixelRes": "five")", "dfPixelRes"},
        {R"("format": "lumo-segment", "version": 1, "dfPixelRes": null)", "dfPixelRes"},
        {R"("format": "lumo-segment", "version": 1, "adfCarriedB": [1, 2, 3])", "adfCarriedB"},
        {R"("format": "lumo-segment", "version": 1, "adfCarriedB": 4)", "adfCarriedB"},
        {R"("format": "lumo-segment", "version": 1, "anLevelConvParams": [1, 2, "x", 4])",
         "anLevelConvParams[2]"},
        {R"("format": "lumo-segment", "version": 1, "nLevelConvForm": 7)", "nLevelConvForm"},
        {R"("format": "lumo-segment", "version": 1, "orbitData": {})", "orbitData"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 5, "orbitData": {})",
         "orbitData"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 1, "orbitData": [])",
         "orbitData"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 1,
            "orbitData": {"dfAttitude4": 1})",
         "orbitData.dfAttitude4"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 1,
            "orbitData": {"dfAttitude1": "x"})",
         "orbitData.dfAttitude1"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 1,
            "orbitData": {"pAttitudeLines": [[1, 2], [3]]})",
         "orbitData.pAttitudeLines[1]"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 1,
            "orbitData": {"pAttitudeLines": {"a": 1}})",
         "orbitData.pAttitudeLines"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 1,
            "orbitData": {"nNumAttitudeLines": 3, "pAttitudeLines": [[1, 2]]})",
         "orbitData.nNumAttitudeLines"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 1,
            "orbitData": {"nNumAttitudeLines": -1})",
         "orbitData.nNumAttitudeLines"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 2,
            "orbitData": {"pLinePositions": [[1, 2, 3, 4, 5, 6, 7, 8], [1, 2, 3, "x", 5, 6, 7, 8]]})",
         "orbitData.pLinePositions[1].fLatMid"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 2,
            "orbitData": {"pLinePositions": [[1, 2, 3, 4, 5, 6, 7, 1e39]]})",
         "orbitData.pLinePositions[0].fLonLast"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 2,
            "orbitData": {"pLinePositions": [[1.5, 2, 3, 4, 5, 6, 7, 8]]})",
         "orbitData.pLinePositions[0].nRangeFirst"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 2,
            "orbitData": {"abyLeading": "00ff"})",
         "orbitData.abyLeading"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 3,
            "orbitData": {"szEccentricity": "ABCDEFGHIJKLMNOPQ"})",
         "orbitData.szEccentricity"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 3,
            "orbitData": {"pScanLines": [[0, 1, "", [1, 2, 3, 4, 5, 6], ""]]})",
         "orbitData.pScanLines[0].abyTimeCode"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 3,
            "orbitData": {"pScanLines": [[0, 1, "zz", [1, 2, 3, 4, 5, 6, 7], ""]]})",
         "orbitData.pScanLines[0].abyCarriedA"},
        {R"("format": "lumo-segment", "version": 1, "nOrbitType": 3,
            "orbitData": {"pScanLines": [[0, 1, "", [1, 2, 3, 4, 5, 6, 700], ""]]})",
         "orbitData.pScanLines[0].abyTimeCode[6]"},
    };
    for (const BadDocument& c : aCases) {
        const Json document = Json::parse("{" + std::string(c.pszJson) + "}");
        try {
            lumo::cli::SegmentFromJson(document, "case.json");
            ADD_FAILURE() << "accepted: " << c.pszJson;
        } catch (const nova::DataException& e) {
            const std::string osMessage = e.what();
            EXPECT_EQ(osMessage.rfind("case.json: ", 0), 0u) << osMessage;
            EXPECT_NE(osMessage.find("\"" + std::string(c.pszField) + "\""), std::string::npos)
                << "expected field " << c.pszField << " in: " << osMessage;
        }
    }
    EXPECT_THROW(lumo::cli::SegmentFromJson(Json::array(), "case.json"), nova::DataException);
}

TEST(SegmentFile, FileErrors) {
    EXPECT_THROW(lumo::cli::ReadSegmentFile(TempPath("does_not_exist.json")), nova::DataException);
    const std::string osPath = TempPath("broken.json");
    std::ofstream(osPath) << "{\"format\": \"lumo-segment\", ";
    EXPECT_THROW(lumo::cli::ReadSegmentFile(osPath), nova::DataException);
    std::remove(osPath.c_str());
}

int RunTool(std::vector<std::string> aosArgs, std::string* posOut, std::string* posErr) {
    aosArgs.insert(aosArgs.begin(), "lumo");
    std::vector<char*> apszArgs;
    apszArgs.reserve(aosArgs.size());
    for (std::string& os : aosArgs) apszArgs.push_back(os.data());
    std::ostringstream out;
    std::ostringstream err;
    const int nCode =
        lumo::cli::RunLumo(static_cast<int>(apszArgs.size()), apszArgs.data(), out, err);
    *posOut = out.str();
    *posErr = err.str();
    return nCode;
}

TEST(SegmentCommand, ExamplesAndErrors) {
    const std::string osExamples = std::string(LUMO_SOURCE_DIR) + "/examples/";
    std::string osOut;
    std::string osErr;
    ASSERT_EQ(RunTool({"segment", osExamples + "segment_optical_attitude.json"}, &osOut, &osErr), 0)
        << osErr;
    EXPECT_NE(osOut.find("sensor code 55, model class 1"), std::string::npos) << osOut;
    EXPECT_NE(osOut.find("kind 1 (attitude), 24 lines"), std::string::npos) << osOut;

    const std::string osCopy = TempPath("radar_copy.json");
    ASSERT_EQ(
        RunTool({"segment", osExamples + "segment_radar_lines.json", "-o", osCopy}, &osOut, &osErr),
        0)
        << osErr;
    EXPECT_NE(osOut.find("sensor code 26, model class 3"), std::string::npos) << osOut;
    const SegmentPtr poOriginal =
        lumo::cli::ReadSegmentFile(osExamples + "segment_radar_lines.json");
    const SegmentPtr poCopy = lumo::cli::ReadSegmentFile(osCopy);
    ExpectSameSegment(*poOriginal, *poCopy);
    std::remove(osCopy.c_str());

    ASSERT_EQ(
        RunTool({"segment", osExamples + "segment_radar_lines.json", "--json"}, &osOut, &osErr), 0);
    EXPECT_EQ(Json::parse(osOut)["orbitData"]["nNumLinePositions"], 12);

    const std::string osBad = TempPath("bad.json");
    std::ofstream(osBad) << R"({"format": "lumo-segment", "version": 1, "dfIFOV": [1]})";
    EXPECT_EQ(RunTool({"segment", osBad}, &osOut, &osErr), 1);
    EXPECT_NE(osErr.find("\"dfIFOV\""), std::string::npos) << osErr;
    std::remove(osBad.c_str());
}

}  // namespace
