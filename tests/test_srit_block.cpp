// Block adjustment of several rigorous models: simulated stereo pairs and
// strips with control, tie and check points, and every failure path.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <functional>
#include <string>
#include <vector>

#include "elevation_separation.h"
#include "lumo_ephemeris.h"
#include "lumo_sim.h"
#include "lumo_srit.h"
#include "runtime.h"
#include "support/model_records.h"
#include "support/numbered_error.h"
#include "support/srit_block.h"
#include "support/warnings.h"

namespace {

using lumo::sim::AimAt;
using lumo::sim::Scene;
using lumo::sim::SceneParams;
using lumo::sim::SimPoint;
using lumo::support::Block;
using lumo::support::CheckRms;
using lumo::support::FatalOf;
using lumo::support::GridBlock;
using lumo::support::Id;

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

// Stereo pair at +-20 degrees across track on different dates: nGcp control
// points in both images, 30 tie points of unknown elevation and 50 check
// points, each spread over the whole area. With bCheckObservations the check
// points also go in as check observations 50 px off.
StereoResult RunStereo(Block& sBlock, bool bCheckObservations, int nGcp = 6) {
    SceneParams sRight = AimAt(BaseParams(), 45.0, 3.0, 20.0, 0.0);
    sRight.osAcquisitionDate = "2026-08-02T10:41:00.000000Z";
    sBlock.AddImage(AimAt(BaseParams(), 45.0, 3.0, -20.0, 0.0));
    sBlock.AddImage(sRight);
    using Obs = std::vector<SimPoint>;
    const auto fnSeen = [&](int nPoints, std::uint32_t nSeed, auto fnAdd) {
        return sBlock.ForEachSeenByAll(GroundPoints(45.0, 3.0, nPoints, nSeed), fnAdd);
    };
    const int nSeenGcp = fnSeen(nGcp, 7, [&](int i, const Obs& as, const SimPoint&) {
        for (int k = 0; k < 2; ++k) sBlock.AddGcp(k, "pt" + std::to_string(i), as[k]);
    });
    EXPECT_EQ(nSeenGcp, nGcp);
    std::vector<double> adfTrueTieZ;
    fnSeen(30, 8, [&](int i, const Obs& as, const SimPoint& sGround) {
        for (int k = 0; k < 2; ++k) sBlock.AddTie(k, "TIE" + std::to_string(i), as[k]);
        adfTrueTieZ.push_back(sGround.dfZ);
    });
    EXPECT_EQ(adfTrueTieZ.size(), 30u);
    std::vector<SimPoint> asCheck[2];
    const int nChecks = fnSeen(50, 9, [&](int i, const Obs& as, const SimPoint&) {
        for (int k = 0; k < 2; ++k) {
            asCheck[k].push_back(as[k]);
            SimPoint sWrong = as[k];
            sWrong.dfPixel += 50.0;
            if (bCheckObservations) sBlock.AddGcp(k, "chk" + std::to_string(i), sWrong, 'C');
        }
    });
    EXPECT_EQ(nChecks, 50);
    StereoResult sOut;
    EXPECT_EQ(sBlock.Run(), 1);
    for (int k = 0; k < 2; ++k) sOut.adfCheckRms[k] = CheckRms(sBlock.apsModels[k], asCheck[k]);
    double dfSum = 0.0;
    for (std::size_t t = 0; t < adfTrueTieZ.size(); ++t) {
        // Both observations of a tie point carry its estimated elevation.
        EXPECT_EQ(sBlock.adfTieZ[2 * t], sBlock.adfTieZ[2 * t + 1]);
        dfSum += std::pow(sBlock.adfTieZ[2 * t] - adfTrueTieZ[t], 2);
    }
    sOut.dfTieZRms = std::sqrt(dfSum / 30.0);
    return sOut;
}

TEST(SRITBlock, StereoPairMeetsTheAccuracyTargets) {
    Block sBlock;
    const StereoResult sExact = RunStereo(sBlock, false);
    EXPECT_LE(sExact.adfCheckRms[0], 0.5);
    EXPECT_LE(sExact.adfCheckRms[1], 0.5);
    EXPECT_LE(sExact.dfTieZRms, 2.0);
    // Both records adopted their segments and name the sensor.
    for (int k = 0; k < 2; ++k) {
        EXPECT_EQ(sBlock.apsModels[k]->psEphemeris, sBlock.apsSegments[k]);
        EXPECT_STREQ(sBlock.apsModels[k]->Sensor, "SPOT5_PAN_5");
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

// With four control points per image the sensor row gives eight unknowns.
// Fifty check observations 50 px off must neither pull the fit nor raise
// that to twelve, which the control points could not determine: the models
// put probe points at the same image positions, to far below a pixel. The
// check points are reported with the 50 px error in their residuals.
TEST(SRITBlock, CheckObservationsDoNotChangeTheSolution) {
    Block sPlain, sChecked;
    RunStereo(sPlain, false, 4);
    RunStereo(sChecked, true, 4);
    const std::vector<SimPoint> asProbe = GroundPoints(45.0, 3.0, 20, 5);
    for (int k = 0; k < 2; ++k) {
        EXPECT_EQ(sChecked.apsModels[k]->adfCoef[19], 0.0);  // P11 not adjusted
        for (const SimPoint& s : asProbe) {
            double dfP1 = 0.0, dfL1 = 0.0, dfP2 = 0.0, dfL2 = 0.0;
            SRITGeo2Img(sPlain.apsModels[k], s.dfX, s.dfY, s.dfZ, &dfP1, &dfL1);
            SRITGeo2Img(sChecked.apsModels[k], s.dfX, s.dfY, s.dfZ, &dfP2, &dfL2);
            EXPECT_NEAR(dfP1, dfP2, 1e-4) << "image " << k;
            EXPECT_NEAR(dfL1, dfL2, 1e-4) << "image " << k;
        }
    }
    EXPECT_GT(sChecked.nReported, 4);
    double dfLargest = 0.0;
    for (int p = 0; p < sChecked.nReported; ++p) {
        dfLargest = std::max(dfLargest, std::hypot(sChecked.adfOut[6][p], sChecked.adfOut[7][p]));
    }
    EXPECT_GT(dfLargest, 50.0);
}

// One image through the block adjustment is the one-image computation.
TEST(SRITBlock, OneImageEqualsTheOneImageComputation) {
    Block sBlock;
    sBlock.AddImage(AimAt(BaseParams(), 45.0, 3.0, 12.0, 0.0));
    const std::vector<SimPoint> asPoints = sBlock.asScenes[0].SamplePoints(9, 3, 0.0, 900.0, 0.05);
    for (std::size_t i = 0; i < asPoints.size(); ++i) {
        sBlock.AddGcp(0, "g" + std::to_string(i), asPoints[i]);
    }
    lumo::support::SritPtr psSingle(SRITAllocate());
    ASSERT_EQ(SRITCalculate(psSingle.get(), true, sBlock.asScenes[0].MakeSegment(), 9,
                            &sBlock.asScenes[0].Projection(), sBlock.adfPixel.data(),
                            sBlock.adfLine.data(), sBlock.adfZ.data(), sBlock.adfX.data(),
                            sBlock.adfY.data()),
              1);
    ASSERT_EQ(sBlock.Run(), 1);
    for (int c = 0; c < SRIT_NUM_COEFS; ++c) {
        EXPECT_EQ(psSingle->adfCoef[c], sBlock.apsModels[0]->adfCoef[c]) << c;
    }
    EXPECT_EQ(psSingle->nModelClass, sBlock.apsModels[0]->nModelClass);
    EXPECT_EQ(sBlock.nReported, 0);  // no point is seen in two images
}

// A strip of ten images along track with alternating roll, four control
// points each and ten tie points between neighbours, of known or of
// estimated elevation: every image checks within a pixel. The control points
// of these seeds separate the elevation terms in every image (weak ones are
// WeakImagesHeldNearTheirOrbit's subject).
TEST(SRITBlock, StripOfTenImages) {
    for (const bool bKnown : {false, true}) {
        GridBlock sStrip(10, 1, 90, bKnown, {}, 100);
        ASSERT_EQ(sStrip.nTies, 90);
        ASSERT_EQ(sStrip.sBlock.Run(), 1);
        EXPECT_LE(sStrip.WorstCheckRms(), 1.0) << (bKnown ? "known" : "estimated");
    }
}

// Two images at -15 and +15 degrees, four control points in both.
void FillTwoImages(Block& sBlock) {
    sBlock.AddImage(AimAt(BaseParams(), 45.0, 3.0, -15.0, 0.0));
    sBlock.AddImage(AimAt(BaseParams(), 45.0, 3.0, 15.0, 0.0));
    const auto fnAdd = [&](int i, const std::vector<SimPoint>& as, const SimPoint&) {
        for (int k = 0; k < 2; ++k) sBlock.AddGcp(k, "P" + std::to_string(i), as[k]);
    };
    EXPECT_EQ(sBlock.ForEachSeenByAll(GroundPoints(45.0, 3.0, 4, 11), fnAdd), 4);
}

// Two images with four points each work and the debug log names each
// image's sensor; with three in one, 0, the log names that image, and
// nothing is adopted or changed.
TEST(SRITBlock, ImageWithoutEnoughPoints) {
    lumo::support::DebugCapture oLog(1);
    Block sBlock;
    FillTwoImages(sBlock);
    EXPECT_EQ(sBlock.Run(), 1);
    EXPECT_EQ(sBlock.nReported, 4);
    Block sShort;
    FillTwoImages(sShort);
    sShort.osGcpImage.replace(7 * SRIT_ID_SIZE, SRIT_ID_SIZE, Id("IMG0"));
    const SRITInfo_t asBefore[] = {*sShort.apsModels[0], *sShort.apsModels[1]};
    EXPECT_EQ(sShort.Run(), 0);
    for (int k = 0; k < 2; ++k) {
        EXPECT_EQ(std::memcmp(&asBefore[k], sShort.apsModels[k], sizeof(SRITInfo_t)), 0) << k;
    }
    std::vector<std::string> asMessages;
    for (const auto& r : oLog.maoRecords) {
        if (r.nLine != 1268 && r.nLine != 1100) continue;
        asMessages.push_back(r.osMessage);
        EXPECT_EQ(r.osModule, "lumokit");
        EXPECT_EQ(r.osFile, "mathmodel/lumo/sritcalc_imp");
        EXPECT_EQ(r.nLevel, 1);
    }
    const std::string osSensor = "SRITModel[i]->Sensor=SPOT5_PAN_5\n";
    EXPECT_EQ(asMessages,
              (std::vector<std::string>{osSensor, osSensor,
                                        "Not enough points in image 1! no model calculated\n"}));
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
    std::vector<SimPoint> asCheck[2];
    double dfTruePZ = 0.0;
    // Every third point is control, the last of them without elevation;
    // every third a tie of known elevation; the rest check points.
    const auto fnAdd = [&](int i, const std::vector<SimPoint>& as, const SimPoint& sGround) {
        const std::string osId = "p" + std::to_string(i);
        if (i == 27) dfTruePZ = sGround.dfZ;
        for (int k = 0; k < 2; ++k) {
            SimPoint sObs = as[k];
            if (i == 27) sObs.dfZ = LUMO_NULL_VALUE;  // planimetric control only
            if (i % 3 == 0) sBlock.AddGcp(k, osId, sObs);
            if (i % 3 == 1) sBlock.AddTie(k, osId, sObs, sGround.dfZ);
            if (i % 3 == 2) asCheck[k].push_back(sObs);
        }
    };
    ASSERT_EQ(sBlock.ForEachSeenByAll(GroundPoints(45.0, 3.0, 30, 21), fnAdd), 30);
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
    for (int k = 0; k < 2; ++k) EXPECT_LE(CheckRms(sBlock.apsModels[k], asCheck[k]), 0.5) << k;
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

}  // namespace
