// Block adjustment of several rigorous models: simulated stereo pairs and
// strips with control, tie and check points, and every failure path.
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <sstream>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "cli.h"
#include "elevation_separation.h"
#include "lumo_ephemeris.h"
#include "lumo_sim.h"
#include "lumo_srit.h"
#include "model_io.h"
#include "runtime.h"
#include "support/cli_runner.h"
#include "support/numbered_error.h"
#include "support/srit_block.h"

namespace {

using lumo::sim::AimAt;
using lumo::sim::ProjectInto;
using lumo::sim::Scene;
using lumo::sim::SceneParams;
using lumo::sim::SimPoint;
using lumo::support::Block;
using lumo::support::FatalOf;
using lumo::support::GridBlock;
using lumo::support::Id;

// RMS distance in pixels between the model's image position of the points
// and their true one.
double CheckRms(const SRITInfo_t* psModel, const std::vector<SimPoint>& asPoints) {
    double dfSum = 0.0;
    for (const SimPoint& s : asPoints) {
        double dfPixel = 0.0, dfLine = 0.0;
        SRITGeo2Img(psModel, s.dfX, s.dfY, s.dfZ, &dfPixel, &dfLine);
        dfSum += (dfPixel - s.dfPixel) * (dfPixel - s.dfPixel) +
                 (dfLine - s.dfLine) * (dfLine - s.dfLine);
    }
    return std::sqrt(dfSum / static_cast<double>(asPoints.size()));
}

SceneParams BaseParams() {
    SceneParams s;
    s.nUtmZone = 31;
    return s;
}

// Ground points of the area seen by a nadir view of (lat, lon).
std::vector<SimPoint> GroundPoints(double dfLat, double dfLon, int nPoints, std::uint32_t nSeed) {
    const Scene sNadir(AimAt(BaseParams(), dfLat, dfLon, 0.0, 0.0));
    return sNadir.SamplePoints(nPoints, nSeed, 0.0, 1500.0, 0.1);
}

struct StereoResult {
    double adfCheckRms[2] = {0.0, 0.0};
    double dfTieZRms = 0.0;
};

// Stereo pair at +-20 degrees across track on different dates: 6 GCPs in
// both images, 30 tie points of unknown elevation, check points apart.
StereoResult RunStereo(Block& sBlock, double dfNoise, bool bCheckObservations, std::size_t nGcp = 6,
                       std::size_t nTie = 30) {
    SceneParams sLeft = AimAt(BaseParams(), 45.0, 3.0, -20.0, 0.0);
    SceneParams sRight = AimAt(BaseParams(), 45.0, 3.0, 20.0, 0.0);
    sRight.osAcquisitionDate = "2026-08-02T10:41:00.000000Z";
    sBlock.AddImage(sLeft);
    sBlock.AddImage(sRight);
    // Control, tie and check points each spread over the whole area.
    std::vector<SimPoint> asCheck[2];
    std::vector<double> adfTrueTieZ;
    const auto fnBoth = [&](const SimPoint& sGround, SimPoint* psObs) {
        return ProjectInto(sBlock.asScenes[0], sGround, &psObs[0]) &&
               ProjectInto(sBlock.asScenes[1], sGround, &psObs[1]);
    };
    const auto fnNoisy = [&](SimPoint s, std::uint32_t nSeed) {
        std::vector<SimPoint> asOne{s};
        lumo::sim::AddImageNoise(&asOne, dfNoise, nSeed);
        return asOne[0];
    };
    std::uint32_t nSeed = 1;
    for (const SimPoint& sGround : GroundPoints(45.0, 3.0, static_cast<int>(nGcp), 7)) {
        SimPoint s[2];
        if (!fnBoth(sGround, s)) continue;
        const std::string osId = "pt" + std::to_string(nSeed);
        for (int k = 0; k < 2; ++k) sBlock.AddGcp(k, osId, fnNoisy(s[k], ++nSeed));
    }
    EXPECT_EQ(sBlock.adfX.size(), 2 * nGcp);
    for (const SimPoint& sGround : GroundPoints(45.0, 3.0, static_cast<int>(nTie), 8)) {
        SimPoint s[2];
        if (!fnBoth(sGround, s)) continue;
        const std::string osId = "TIE" + std::to_string(nSeed);
        for (int k = 0; k < 2; ++k) sBlock.AddTie(k, osId, fnNoisy(s[k], ++nSeed));
        adfTrueTieZ.push_back(sGround.dfZ);
    }
    int nCheck = 0;
    for (const SimPoint& sGround : GroundPoints(45.0, 3.0, 50, 9)) {
        SimPoint s[2];
        if (!fnBoth(sGround, s)) continue;
        ++nCheck;
        for (int k = 0; k < 2; ++k) {
            asCheck[k].push_back(s[k]);
            if (bCheckObservations) {
                SimPoint sWrong = s[k];
                sWrong.dfPixel += 50.0;  // check observations must not pull the fit
                sBlock.AddGcp(k, "chk" + std::to_string(nCheck), sWrong, 'C');
            }
        }
    }
    EXPECT_EQ(nCheck, 50);
    EXPECT_EQ(adfTrueTieZ.size(), nTie);
    StereoResult sOut;
    EXPECT_EQ(sBlock.Run(), 1);
    for (int k = 0; k < 2; ++k) sOut.adfCheckRms[k] = CheckRms(sBlock.apsModels[k], asCheck[k]);
    double dfSum = 0.0;
    for (std::size_t t = 0; t < adfTrueTieZ.size(); ++t) {
        // Both observations of a tie point carry its estimated elevation.
        EXPECT_EQ(sBlock.adfTieZ[2 * t], sBlock.adfTieZ[2 * t + 1]);
        const double dfErr = sBlock.adfTieZ[2 * t] - adfTrueTieZ[t];
        dfSum += dfErr * dfErr;
    }
    sOut.dfTieZRms =
        std::sqrt(dfSum / static_cast<double>(std::max<std::size_t>(1, adfTrueTieZ.size())));
    return sOut;
}

TEST(SRITBlock, StereoPairMeetsTheAccuracyTargets) {
    Block sBlock;
    const StereoResult sExact = RunStereo(sBlock, 0.0, false);
    std::printf("stereo pair, exact measurements: check RMS %.3f / %.3f px, tie Z RMS %.3f m\n",
                sExact.adfCheckRms[0], sExact.adfCheckRms[1], sExact.dfTieZRms);
    EXPECT_LE(sExact.adfCheckRms[0], 0.5);
    EXPECT_LE(sExact.adfCheckRms[1], 0.5);
    EXPECT_LE(sExact.dfTieZRms, 2.0);
    // Both records adopted their segments and name the sensor.
    for (int k = 0; k < 2; ++k) {
        EXPECT_EQ(sBlock.apsModels[k]->psEphemeris, sBlock.apsSegments[k]);
        EXPECT_EQ(std::string(sBlock.apsModels[k]->Sensor), "SPOT5_PAN_5");
        EXPECT_EQ(sBlock.apsModels[k]->nSensor, 55);
    }
    // The six control points are reported, each seen in both images, with
    // an intersection that lands near the given position.
    ASSERT_EQ(sBlock.nReported, 6);
    for (int p = 0; p < 6; ++p) {
        EXPECT_EQ(sBlock.anReportedImages[p], 2);
        EXPECT_EQ(sBlock.osReportedIds.substr(p * SRIT_ID_SIZE, 2), "pt");
        for (int c = 0; c < 3; ++c) {
            EXPECT_NEAR(sBlock.adfOut[c][p] - sBlock.adfOut[3 + c][p], sBlock.adfOut[6 + c][p],
                        1e-6);
            EXPECT_LT(std::abs(sBlock.adfOut[6 + c][p]), 5.0);
        }
    }
}

// The two blocks' models put probe points of the area at the same image
// positions, to far below a pixel.
void ExpectSameImagePositions(const Block& sA, const Block& sB) {
    const std::vector<SimPoint> asProbe = GroundPoints(45.0, 3.0, 20, 5);
    for (std::size_t k = 0; k < sA.apsModels.size(); ++k) {
        for (const SimPoint& s : asProbe) {
            double dfP1 = 0.0, dfL1 = 0.0, dfP2 = 0.0, dfL2 = 0.0;
            SRITGeo2Img(sA.apsModels[k], s.dfX, s.dfY, s.dfZ, &dfP1, &dfL1);
            SRITGeo2Img(sB.apsModels[k], s.dfX, s.dfY, s.dfZ, &dfP2, &dfL2);
            EXPECT_NEAR(dfP1, dfP2, 1e-4) << "image " << k;
            EXPECT_NEAR(dfL1, dfL2, 1e-4) << "image " << k;
        }
    }
}

TEST(SRITBlock, CheckObservationsDoNotChangeTheSolution) {
    Block sPlain, sChecked;
    RunStereo(sPlain, 0.0, false);
    RunStereo(sChecked, 0.0, true);
    // The check observations enter only the mean elevation that the tie
    // points start from: the models agree to far below a pixel.
    ExpectSameImagePositions(sPlain, sChecked);
    // Check points measured in both images are reported too, with the 50 px
    // error showing in their residuals.
    EXPECT_GT(sChecked.nReported, 6);
    double dfLargest = 0.0;
    for (int p = 6; p < sChecked.nReported; ++p) {
        dfLargest = std::max(dfLargest, std::hypot(sChecked.adfOut[6][p], sChecked.adfOut[7][p]));
    }
    EXPECT_GT(dfLargest, 50.0);

    // With four control points per image the sensor row gives eight
    // unknowns; the fifty check observations must not raise that to twelve,
    // which the control points could not determine.
    Block sPlain4, sChecked4;
    RunStereo(sPlain4, 0.0, false, 4);
    RunStereo(sChecked4, 0.0, true, 4);
    for (int k = 0; k < 2; ++k) {
        EXPECT_EQ(sChecked4.apsModels[k]->adfCoef[19], 0.0);  // P11 not adjusted
    }
    ExpectSameImagePositions(sPlain4, sChecked4);
}

// One image through the block adjustment is the one-image computation.
TEST(SRITBlock, OneImageEqualsTheOneImageComputation) {
    Block sBlock;
    sBlock.AddImage(AimAt(BaseParams(), 45.0, 3.0, 12.0, 0.0));
    const std::vector<SimPoint> asPoints = sBlock.asScenes[0].SamplePoints(9, 3, 0.0, 900.0, 0.05);
    std::vector<double> adfPixel, adfLine, adfX, adfY, adfZ;
    for (std::size_t i = 0; i < asPoints.size(); ++i) {
        sBlock.AddGcp(0, "g" + std::to_string(i), asPoints[i]);
    }
    SRITInfo_t* psSingle = SRITAllocate();
    EphemerisSeg_t* psSeg = sBlock.asScenes[0].MakeSegment();
    ASSERT_EQ(SRITCalculate(psSingle, true, psSeg, 9, &sBlock.asScenes[0].Projection(),
                            sBlock.adfPixel.data(), sBlock.adfLine.data(), sBlock.adfZ.data(),
                            sBlock.adfX.data(), sBlock.adfY.data()),
              1);
    ASSERT_EQ(sBlock.Run(), 1);
    for (int c = 0; c < SRIT_NUM_COEFS; ++c) {
        EXPECT_EQ(psSingle->adfCoef[c], sBlock.apsModels[0]->adfCoef[c]) << c;
    }
    EXPECT_EQ(psSingle->nModelClass, sBlock.apsModels[0]->nModelClass);
    EXPECT_EQ(sBlock.nReported, 0);  // no point is seen in two images
    LumoFreeSRITInfo(psSingle);
}

// A strip of ten images along track with alternating roll, four control
// points each and ten tie points between neighbours, of known or of unknown
// elevation; returns the check RMS of every image.
std::vector<double> RunStrip(bool bKnownTieElevation) {
    Block sBlock;
    std::vector<std::vector<SimPoint>> aasCheck;
    for (int k = 0; k < 10; ++k) {
        SceneParams s = AimAt(BaseParams(), 46.5 - 0.4 * k, 3.0, k % 2 == 0 ? -10.0 : 10.0, 0.0);
        s.osAcquisitionDate = "2026-0" + std::to_string(1 + k % 9) + "-10T10:30:00.000000Z";
        sBlock.AddImage(s);
    }
    for (int k = 0; k < 10; ++k) {
        const Scene& sScene = sBlock.asScenes[static_cast<std::size_t>(k)];
        const std::vector<SimPoint> asGcp =
            sScene.SamplePoints(4, static_cast<std::uint32_t>(100 + k), 0.0, 1200.0, 0.05);
        for (std::size_t i = 0; i < asGcp.size(); ++i) {
            sBlock.AddGcp(k, "G" + std::to_string(k) + "_" + std::to_string(i), asGcp[i]);
        }
        aasCheck.push_back(
            sScene.SamplePoints(25, static_cast<std::uint32_t>(200 + k), 0.0, 1200.0, 0.02));
        // The check points also go in as check observations, 50 px off:
        // they neither pull the fit nor raise the image's unknown count
        // beyond what its four control points determine.
        for (std::size_t i = 0; i < aasCheck.back().size(); ++i) {
            SimPoint sWrong = aasCheck.back()[i];
            sWrong.dfPixel += 50.0;
            sBlock.AddGcp(k, "C" + std::to_string(k) + "_" + std::to_string(i), sWrong, 'C');
        }
        if (k == 9) break;
        // Tie points in the overlap with the next image.
        const std::vector<SimPoint> asCandidates =
            sScene.SamplePoints(400, static_cast<std::uint32_t>(300 + k), 0.0, 1200.0, 0.02);
        int nTies = 0;
        for (std::size_t i = 0; i < asCandidates.size() && nTies < 10; ++i) {
            SimPoint sNext;
            if (!ProjectInto(sBlock.asScenes[static_cast<std::size_t>(k) + 1], asCandidates[i],
                             &sNext, 0.02)) {
                continue;
            }
            const std::string osId = "T" + std::to_string(k) + "_" + std::to_string(i);
            const double dfZ = bKnownTieElevation ? sNext.dfZ : LUMO_NULL_VALUE;
            sBlock.AddTie(k, osId, asCandidates[i], dfZ);
            sBlock.AddTie(k + 1, osId, sNext, dfZ);
            ++nTies;
        }
        EXPECT_EQ(nTies, 10) << "overlap of images " << k << " and " << k + 1;
    }
    std::vector<double> adfRms;
    EXPECT_EQ(sBlock.Run(), 1);
    if (!sBlock.bAdopted) return adfRms;
    for (int k = 0; k < 10; ++k) adfRms.push_back(CheckRms(sBlock.apsModels[k], aasCheck[k]));
    return adfRms;
}

TEST(SRITBlock, StripOfTenImages) {
    for (const bool bKnown : {false, true}) {
        const std::vector<double> adfRms = RunStrip(bKnown);
        ASSERT_EQ(adfRms.size(), 10u);
        for (int k = 0; k < 10; ++k) {
            std::printf("strip image %d, tie elevations %s: check RMS %.3f px\n", k,
                        bKnown ? "known" : "estimated", adfRms[k]);
            EXPECT_LE(adfRms[k], 1.0) << "image " << k;
        }
    }
}

// Two images at -15 and +15 degrees, four control points in both.
void FillTwoImages(Block& sBlock) {
    sBlock.AddImage(AimAt(BaseParams(), 45.0, 3.0, -15.0, 0.0));
    sBlock.AddImage(AimAt(BaseParams(), 45.0, 3.0, 15.0, 0.0));
    const std::vector<SimPoint> asGround = GroundPoints(45.0, 3.0, 4, 11);
    for (std::size_t i = 0; i < asGround.size(); ++i) {
        for (int k = 0; k < 2; ++k) {
            SimPoint s;
            ASSERT_TRUE(ProjectInto(sBlock.asScenes[static_cast<std::size_t>(k)], asGround[i], &s));
            sBlock.AddGcp(k, "P" + std::to_string(i), s);
        }
    }
}

// The debug log names each image's sensor, and the image without enough
// points.
TEST(SRITBlock, DebugMessages) {
    std::vector<nova::diag::DebugRecord> asRecords;
    const int nOldLevel = nova::diag::Debugger::moDebugLevel;
    nova::diag::Debugger::SetDebugLevel(1);
    auto oldSink = nova::diag::Debugger::SetSink(
        [&asRecords](const nova::diag::DebugRecord& r) { asRecords.push_back(r); });
    {
        Block sBlock;
        FillTwoImages(sBlock);
        EXPECT_EQ(sBlock.Run(), 1);
    }
    {
        Block sBlock;
        FillTwoImages(sBlock);
        sBlock.osGcpImage.replace(7 * SRIT_ID_SIZE, SRIT_ID_SIZE, Id("IMG0"));
        EXPECT_EQ(sBlock.Run(), 0);  // image 1 keeps three observations
    }
    nova::diag::Debugger::SetSink(oldSink);
    nova::diag::Debugger::SetDebugLevel(nOldLevel);
    std::vector<std::string> asSensor;
    std::string osNotEnough;
    for (const auto& r : asRecords) {
        if (r.nLine == 1268) asSensor.push_back(r.osMessage);
        if (r.nLine == 1100) osNotEnough = r.osMessage;
        if (r.nLine == 1268 || r.nLine == 1100) {
            EXPECT_EQ(r.osModule, "lumokit");
            EXPECT_EQ(r.osFile, "mathmodel/lumo/sritcalc_imp");
            EXPECT_EQ(r.nLevel, 1);
        }
    }
    EXPECT_EQ(asSensor, std::vector<std::string>(2, "SRITModel[i]->Sensor=SPOT5_PAN_5\n"));
    EXPECT_EQ(osNotEnough, "Not enough points in image 1! no model calculated\n");
}

TEST(SRITBlock, FailurePaths) {
    // More than 250 images: error 11 before any array is looked at.
    const auto sLimit = FatalOf([] {
        SRITCalculateN(251, nullptr, nullptr, true, nullptr, nullptr, 3, nullptr, nullptr, nullptr,
                       nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr,
                       nullptr, nullptr, 0, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr,
                       nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr,
                       nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr);
    });
    EXPECT_EQ(sLimit.first, 11);
    EXPECT_NE(sLimit.second.find("Number of images has exceeded limit."), std::string::npos);
    {
        // Two images with four points each work; with three in one, 0 and
        // nothing adopted or changed.
        Block sBlock;
        FillTwoImages(sBlock);
        EXPECT_EQ(sBlock.Run(), 1);
        EXPECT_EQ(sBlock.nReported, 4);
        Block sShort;
        FillTwoImages(sShort);
        sShort.osGcpImage.replace(7 * SRIT_ID_SIZE, SRIT_ID_SIZE, Id("IMG0"));
        const auto fnBytes = [&] {
            const auto* pby = reinterpret_cast<const unsigned char*>(sShort.apsModels[0]);
            std::vector<unsigned char> aby(pby, pby + sizeof(SRITInfo_t));
            pby = reinterpret_cast<const unsigned char*>(sShort.apsModels[1]);
            aby.insert(aby.end(), pby, pby + sizeof(SRITInfo_t));
            return aby;
        };
        const std::vector<unsigned char> abyBefore = fnBytes();
        EXPECT_EQ(sShort.Run(), 0);
        EXPECT_EQ(fnBytes(), abyBefore);
    }
    const SimPoint sTie{100.0, 100.0, 0.0, 0.0, 0.0};
    const SimPoint sBadTie{std::nan(""), 100.0, 0.0, 0.0, 0.0};
    const struct {
        const char* pszText;  // part of the error's text
        std::function<void(Block&)> fnBreak;
    } aCases[] = {
        {"observation 4 names image \"NOSUCH",
         [](Block& b) { std::memcpy(&b.osGcpImage[3 * SRIT_ID_SIZE], "NOSUCH", 6); }},
        {"single tie observation", [&](Block& b) { b.AddTie(0, "T", sTie); }},
        {"GCP number 3 has invalid type.", [](Block& b) { b.adfY[2] = LUMO_NULL_VALUE; }},
        {"tie observation 1 has an invalid pixel",
         [&](Block& b) {
             b.AddTie(0, "T", sBadTie);
             b.AddTie(1, "T", sBadTie);
         }},
        // Two images sharing a segment, or a record still holding another
        // image's new segment, would release it while in use.
        {"share", [](Block& b) { b.apsSegments[1] = b.apsSegments[0]; }},
        {"images 0 and 1 share", [](Block& b) { b.apsModels[0]->psEphemeris = b.apsSegments[1]; }},
    };
    for (const auto& c : aCases) {
        Block sBlock;
        FillTwoImages(sBlock);
        EphemerisSeg_t* apsSegs[2] = {sBlock.apsSegments[0], sBlock.apsSegments[1]};
        EphemerisSeg_t* psOwn = sBlock.apsModels[0]->psEphemeris;
        c.fnBreak(sBlock);
        const auto sError = FatalOf([&] { sBlock.Run(); });
        EXPECT_EQ(sError.first, 100) << c.pszText;
        EXPECT_NE(sError.second.find(c.pszText), std::string::npos) << sError.second;
        // Hand every block back its own so that it releases each once.
        sBlock.apsSegments[0] = apsSegs[0];
        sBlock.apsSegments[1] = apsSegs[1];
        sBlock.apsModels[0]->psEphemeris = psOwn;
    }
}

// Control points without elevation ('P') and tie points with a known
// elevation ('A') take part; the elevation of a 'P' point is estimated.
TEST(SRITBlock, PointTypesWithoutElevationAndKnownTieElevation) {
    Block sBlock;
    sBlock.AddImage(AimAt(BaseParams(), 45.0, 3.0, -20.0, 0.0));
    sBlock.AddImage(AimAt(BaseParams(), 45.0, 3.0, 20.0, 0.0));
    const std::vector<SimPoint> asGround = GroundPoints(45.0, 3.0, 30, 21);
    std::vector<SimPoint> asCheck;
    int nUsed = 0;
    double dfTruePZ = 0.0;
    for (std::size_t i = 0; i < asGround.size(); ++i) {
        SimPoint s[2];
        if (!ProjectInto(sBlock.asScenes[0], asGround[i], &s[0]) ||
            !ProjectInto(sBlock.asScenes[1], asGround[i], &s[1])) {
            continue;
        }
        // Every third point is control, the last of them without elevation;
        // every third a tie of known elevation; the rest check points.
        const std::string osId = "p" + std::to_string(i);
        for (int k = 0; k < 2; ++k) {
            SimPoint sObs = s[k];
            if (i % 3 == 0) {
                if (i == 27) {
                    sObs.dfZ = LUMO_NULL_VALUE;  // planimetric control only
                    dfTruePZ = asGround[i].dfZ;
                }
                sBlock.AddGcp(k, osId, sObs);
            } else if (i % 3 == 1) {
                sBlock.AddTie(k, osId, sObs, asGround[i].dfZ);  // known elevation
            } else {
                asCheck.push_back(s[k]);
            }
        }
        ++nUsed;
    }
    ASSERT_EQ(nUsed, 30);
    const std::vector<double> adfGivenTieZ = sBlock.adfTieZ;
    ASSERT_EQ(sBlock.Run(), 1);
    // The 'P' point is reported with an estimated elevation near the truth
    // and no elevation residual.
    ASSERT_EQ(sBlock.nReported, 10);
    EXPECT_EQ(sBlock.adfOut[2][9], LUMO_NULL_VALUE);
    EXPECT_EQ(sBlock.adfOut[8][9], 0.0);
    EXPECT_NEAR(sBlock.adfOut[5][9], dfTruePZ, 2.0);
    // Known tie elevations come back as the intersection's, close to the given.
    ASSERT_EQ(sBlock.adfTieZ.size(), 20u);
    for (std::size_t t = 0; t < sBlock.adfTieZ.size(); ++t) {
        EXPECT_NEAR(sBlock.adfTieZ[t], adfGivenTieZ[t], 2.0) << t;
        EXPECT_TRUE(std::isfinite(sBlock.adfTieX[t]) && std::isfinite(sBlock.adfTieY[t]));
    }
    for (int k = 0; k < 2; ++k) {
        std::vector<SimPoint> asMine;
        for (std::size_t i = k; i < asCheck.size(); i += 2) asMine.push_back(asCheck[i]);
        EXPECT_LE(CheckRms(sBlock.apsModels[k], asMine), 0.5) << k;
    }
}

// A 3 x 3 grid, four control points per image, ties of estimated
// elevation: images whose control points cannot separate the elevation
// terms pass their error on, several pixels at the worst image. Holding the
// images that the block command's rule finds near their orbit values brings
// every image within a pixel without holding them all.
TEST(SRITBlock, WeakImagesHeldNearTheirOrbit) {
    const GridBlock sProbe(3, 3, 0, false);
    std::vector<char> abWeak;
    for (std::size_t k = 0; k < sProbe.aasControl.size(); ++k) {
        std::vector<lumo::cli::ControlSample> asSamples;
        for (const SimPoint& s : sProbe.aasControl[k])
            asSamples.push_back({s.dfPixel, s.dfLine, s.dfZ});
        const auto sSeparation = lumo::cli::SeparationOf(*sProbe.sBlock.apsSegments[k], asSamples);
        abWeak.push_back(sSeparation.Weakest() < lumo::cli::kWeakSeparation ? 1 : 0);
        // Heights on a steep plane over the image leave the along-track term
        // little beyond the Earth's curvature; one height, or points on one
        // line, nothing to either term.
        for (lumo::cli::ControlSample& c : asSamples) c.dfZ = 0.3 * c.dfPixel - 0.2 * c.dfLine;
        EXPECT_LT(lumo::cli::SeparationOf(*sProbe.sBlock.apsSegments[k], asSamples).dfAlong,
                  0.1 * lumo::cli::kWeakSeparation);
        for (lumo::cli::ControlSample& c : asSamples) c.dfLine = 3000.0;
        EXPECT_EQ(lumo::cli::SeparationOf(*sProbe.sBlock.apsSegments[k], asSamples).Weakest(), 0.0);
        for (lumo::cli::ControlSample& c : asSamples) c.dfZ = 500.0;
        EXPECT_EQ(lumo::cli::SeparationOf(*sProbe.sBlock.apsSegments[k], asSamples).Weakest(), 0.0);
    }
    const auto fnWorst = [](const std::vector<char>& abHeld) {
        GridBlock sGrid(3, 3, 180, false, abHeld);
        EXPECT_EQ(sGrid.sBlock.Run(), 1);
        return sGrid.WorstCheckRms();
    };
    EXPECT_GT(fnWorst({}), 2.0);
    EXPECT_LE(fnWorst(abWeak), 1.0);
    EXPECT_LT(std::count(abWeak.begin(), abWeak.end(), 1), 9);
}

// `lumo block` on the bundled stereo project: models and report written,
// --constrain reaches the segments, and project errors name the bad value.
TEST(SRITBlockCli, BundledStereoProject) {
    namespace fs = std::filesystem;
    const fs::path dir =
        fs::temp_directory_path() / ("lumo_block_cli_" + std::to_string(::getpid()));
    const std::string project = std::string(LUMO_SOURCE_DIR) + "/examples/block_stereo.json";
    const auto fnRun = [](std::vector<std::string> args, std::string* posErr) {
        const lumo::support::RunResult sRun = lumo::support::RunTool(std::move(args));
        *posErr = sRun.osErr;
        return sRun.nCode;
    };
    std::string osErr;
    ASSERT_EQ(fnRun({"block", project, "-o", dir.string()}, &osErr), 0) << osErr;
    nlohmann::json report;
    std::ifstream((dir / "report.json").string()) >> report;
    ASSERT_EQ(report["images"].size(), 2u);
    nlohmann::json projectDoc;
    std::ifstream(project) >> projectDoc;
    EXPECT_EQ(report["tiePoints"].size(), 12u);
    EXPECT_EQ(report["controlPoints"].size(), 12u);

    // Without options only images whose control points cannot separate the
    // elevation terms are constrained, and the report says why; --constrain
    // sets every segment's constraint flag: the report and the written
    // models say so, and the bundled pair still checks well.
    for (const auto& image : report["images"]) {
        const bool bWeak = std::min(image["elevationSeparation"]["across"].get<double>(),
                                    image["elevationSeparation"]["along"].get<double>()) <
                           lumo::cli::kWeakSeparation;
        EXPECT_EQ(image["constrained"].get<bool>(), bWeak);
        if (bWeak) {
            EXPECT_EQ(image["constrainedBy"], "weak control points");
        }
    }
    ASSERT_EQ(fnRun({"block", project, "-o", dir.string(), "--constrain"}, &osErr), 0) << osErr;
    std::ifstream((dir / "report.json").string()) >> report;
    for (const auto& image : report["images"]) {
        EXPECT_TRUE(image["constrained"].get<bool>());
        EXPECT_EQ(image["constrainedBy"], "--constrain");
        EXPECT_LT(image["checkResiduals"]["rmsPixel"].get<double>(), 0.5);
        EXPECT_LT(image["checkResiduals"]["rmsLine"].get<double>(), 0.5);
        const lumo::cli::LoadedModel model =
            lumo::cli::ReadModelFile(image["model"].get<std::string>());
        const auto* psModel = static_cast<const SRITInfo_t*>(model.poRecord.get());
        EXPECT_EQ(psModel->psEphemeris->nSupplementFlag, 1);
    }

    // A tie naming an image the project does not list.
    projectDoc["ties"][3]["image"] = "middle";
    for (auto& image : projectDoc["images"]) {
        image["segment"] =
            std::string(LUMO_SOURCE_DIR) + "/examples/" + image["segment"].get<std::string>();
    }
    const std::string bad = (dir / "bad.json").string();
    std::ofstream(bad) << projectDoc.dump();
    EXPECT_NE(fnRun({"block", bad, "-o", dir.string()}, &osErr), 0);
    EXPECT_NE(osErr.find("ties[3] names image \"middle\""), std::string::npos) << osErr;
    fs::remove_all(dir);
}

}  // namespace
