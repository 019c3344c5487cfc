// The arrays of one block adjustment (SRITCalculateN) over simulated scenes,
// filled observation by observation; shared by the block tests and the block
// benchmark.
#pragma once

#include <algorithm>
#include <cmath>
#include <string>
#include <vector>

#include "lumo_ephemeris.h"
#include "lumo_sim.h"
#include "lumo_srit.h"

namespace lumo {
namespace support {

// RMS distance in pixels between a model's image positions of the points and
// their true ones, through the closed ground-to-image form or the exact one;
// HUGE_VAL when the exact form fails on a point.
inline double CheckRms(const SRITInfo_t* psModel, const std::vector<lumo::sim::SimPoint>& asPoints,
                       bool bExact = false) {
    double dfSum = 0.0;
    for (const lumo::sim::SimPoint& s : asPoints) {
        double dfPixel = 0.0, dfLine = 0.0;
        if (!bExact) {
            SRITGeo2Img(psModel, s.dfX, s.dfY, s.dfZ, &dfPixel, &dfLine);
        } else if (SRITGeo2ImgExact(psModel, s.dfX, s.dfY, s.dfZ, &dfPixel, &dfLine) != 1) {
            return HUGE_VAL;
        }
        dfSum += std::pow(dfPixel - s.dfPixel, 2) + std::pow(dfLine - s.dfLine, 2);
    }
    return std::sqrt(dfSum / static_cast<double>(asPoints.size()));
}

// Identifier of SRIT_ID_SIZE characters, blank padded.
inline std::string Id(const std::string& osText) {
    std::string os = osText;
    os.resize(SRIT_ID_SIZE, ' ');
    return os;
}

// Owns the models, and the segments until the models adopt them. Run() may
// be called again: tie elevations start from the values the ties were added
// with each time.
struct Block {
    std::vector<lumo::sim::Scene> asScenes;
    std::string osImageIds;
    std::vector<SRITInfo_t*> apsModels;
    std::vector<EphemerisSeg_t*> apsSegments;
    bool bAdopted = false;

    std::string osGcpImage, osGcpPoint, osGcpUsage;
    std::vector<double> adfPixel, adfLine, adfX, adfY, adfZ;
    std::string osTieImage, osTiePoint;
    std::vector<double> adfTiePixel, adfTieLine, adfTieZ, adfTieX, adfTieY;
    std::vector<double> adfTieZGiven;

    int nReported = 0;
    std::string osReportedIds;
    std::vector<int> anReportedImages;
    std::vector<double> adfOut[9];  // given, estimated, residual X Y Z

    Block() = default;
    Block(const Block&) = delete;
    Block& operator=(const Block&) = delete;
    ~Block() {
        for (SRITInfo_t* p : apsModels) LumoFreeSRITInfo(p);
        if (!bAdopted) {
            for (EphemerisSeg_t* p : apsSegments) LumoSatEphemerisFree(p);
        }
    }

    int AddImage(const lumo::sim::SceneParams& sParams) {
        asScenes.emplace_back(sParams);
        osImageIds += Id("IMG" + std::to_string(asScenes.size() - 1));
        apsModels.push_back(SRITAllocate());
        apsSegments.push_back(asScenes.back().MakeSegment());
        return static_cast<int>(asScenes.size()) - 1;
    }
    void AddGcp(int k, const std::string& osId, const lumo::sim::SimPoint& s, char cUsage = 'A') {
        osGcpImage += Id("img" + std::to_string(k));  // identifiers ignore case
        osGcpPoint += Id(osId);
        osGcpUsage += cUsage;
        adfPixel.push_back(s.dfPixel);
        adfLine.push_back(s.dfLine);
        adfX.push_back(s.dfX);
        adfY.push_back(s.dfY);
        adfZ.push_back(s.dfZ);
    }
    void AddTie(int k, const std::string& osId, const lumo::sim::SimPoint& s,
                double dfZ = LUMO_NULL_VALUE) {
        osTieImage += Id("IMG" + std::to_string(k));
        osTiePoint += Id(osId);
        adfTiePixel.push_back(s.dfPixel);
        adfTieLine.push_back(s.dfLine);
        adfTieZ.push_back(dfZ);
        adfTieZGiven.push_back(dfZ);
    }
    // Calls fn(index, observation in each image, ground point) for each of
    // the ground points that every image sees; returns how many it called.
    template <typename Fn>
    int ForEachSeenByAll(const std::vector<lumo::sim::SimPoint>& asGround, Fn fn) const {
        int n = 0;
        for (const lumo::sim::SimPoint& sGround : asGround) {
            std::vector<lumo::sim::SimPoint> asObs(asScenes.size());
            bool bSeen = true;
            for (std::size_t k = 0; k < asScenes.size() && bSeen; ++k) {
                bSeen = lumo::sim::ProjectInto(asScenes[k], sGround, &asObs[k]);
            }
            if (bSeen) fn(n++, asObs, sGround);
        }
        return n;
    }
    int Run(int nImages = -1) {
        if (nImages < 0) nImages = static_cast<int>(asScenes.size());
        const int nGcp = static_cast<int>(adfX.size());
        const int nTie = static_cast<int>(adfTiePixel.size());
        adfTieZ = adfTieZGiven;
        adfTieX.assign(adfTiePixel.size(), 0.0);
        adfTieY.assign(adfTiePixel.size(), 0.0);
        osReportedIds.assign((static_cast<std::size_t>(nGcp) + 1) * SRIT_ID_SIZE, '\0');
        anReportedImages.assign(static_cast<std::size_t>(nGcp) + 1, 0);
        for (auto& adf : adfOut) adf.assign(static_cast<std::size_t>(nGcp) + 1, 0.0);
        const int nResult = SRITCalculateN(
            nImages, osImageIds.data(), apsModels.data(), true, apsSegments.data(),
            &asScenes[0].Projection(), nGcp, osGcpImage.data(), osGcpPoint.data(),
            osGcpUsage.data(), adfPixel.data(), adfLine.data(), adfZ.data(), nullptr, nullptr,
            nullptr, adfX.data(), adfY.data(), nullptr, nullptr, nTie, osTieImage.data(),
            osTiePoint.data(), adfTiePixel.data(), adfTieLine.data(), adfTieZ.data(), nullptr,
            nullptr, nullptr, adfTieX.data(), adfTieY.data(), &nReported, &osReportedIds[0],
            anReportedImages.data(), adfOut[0].data(), adfOut[1].data(), adfOut[2].data(),
            adfOut[3].data(), adfOut[4].data(), adfOut[5].data(), adfOut[6].data(),
            adfOut[7].data(), adfOut[8].data());
        if (nResult == 1) bAdopted = true;
        return nResult;
    }
};

// A grid of simulated images (strips side by side, alternating roll of 10
// degrees, 6000 x 6000 pixels of 10 m), four control points and 25 check
// observations per image, tie points between right and lower neighbours of
// known or of estimated elevation. Constrained images are those whose
// index abConstrained marks (all of them when it is true for every index).
struct GridBlock {
    Block sBlock;
    int nTies = 0;
    std::vector<std::vector<lumo::sim::SimPoint>> aasControl;  // per image
    std::vector<std::vector<lumo::sim::SimPoint>> aasCheck;

    GridBlock(int nRows, int nCols, int nTiePoints, bool bKnownElevation,
              const std::vector<char>& abConstrained = {}, std::uint32_t nControlSeed = 1000) {
        for (int r = 0; r < nRows; ++r) {
            for (int c = 0; c < nCols; ++c) {
                lumo::sim::SceneParams s;
                s.nUtmZone = 31;
                s.nPixels = s.nLines = 6000;
                s.dfIFOV = 10.0 / 822000.0;
                const auto k = static_cast<std::size_t>(r * nCols + c);
                s.bConstrained = k < abConstrained.size() && abConstrained[k] != 0;
                sBlock.AddImage(lumo::sim::AimAt(s, 46.0 - 0.4 * r, 1.0 + 0.55 * c,
                                                 (r + c) % 2 ? 10.0 : -10.0, 0.0));
            }
        }
        for (std::size_t k = 0; k < sBlock.asScenes.size(); ++k) {
            const auto nSeed = static_cast<std::uint32_t>(k);
            aasControl.push_back(
                sBlock.asScenes[k].SamplePoints(4, nControlSeed + nSeed, 0.0, 1200.0, 0.05));
            aasCheck.push_back(
                sBlock.asScenes[k].SamplePoints(25, 2000 + nSeed, 0.0, 1200.0, 0.05));
            for (const char cUsage : {'A', 'C'}) {
                const auto& asPoints = cUsage == 'A' ? aasControl[k] : aasCheck[k];
                const std::string osPrefix = (cUsage == 'A' ? "G" : "C") + std::to_string(k) + "_";
                for (std::size_t i = 0; i < asPoints.size(); ++i) {
                    sBlock.AddGcp(static_cast<int>(k), osPrefix + std::to_string(i), asPoints[i],
                                  cUsage);
                }
            }
        }
        // Ties with the right and the lower neighbour, spread over the pairs.
        const int nPairs = nRows * (nCols - 1) + (nRows - 1) * nCols;
        int nPair = 0;
        for (int r = 0; r < nRows; ++r) {
            for (int c = 0; c < nCols; ++c) {
                const int k = r * nCols + c;
                for (int nNext : {c + 1 < nCols ? k + 1 : -1, r + 1 < nRows ? k + nCols : -1}) {
                    if (nNext < 0) continue;
                    const int nWanted = nTiePoints / nPairs + (nPair < nTiePoints % nPairs ? 1 : 0);
                    ++nPair;
                    AddTies(k, nNext, nWanted, bKnownElevation);
                }
            }
        }
    }

    // The largest check-point RMS distance over the images (pixels), through
    // the exact ground-to-image form.
    double WorstCheckRms() const {
        double dfWorst = 0.0;
        for (std::size_t k = 0; k < aasCheck.size(); ++k) {
            dfWorst = std::max(dfWorst, CheckRms(sBlock.apsModels[k], aasCheck[k], true));
        }
        return dfWorst;
    }

  private:
    void AddTies(int k, int nNext, int nWanted, bool bKnownElevation) {
        const auto asCandidates = sBlock.asScenes[static_cast<std::size_t>(k)].SamplePoints(
            600, static_cast<std::uint32_t>(3000 + k * 7 + nNext), 0.0, 1200.0, 0.02);
        int nFound = 0;
        for (const lumo::sim::SimPoint& s : asCandidates) {
            if (nFound == nWanted) break;
            lumo::sim::SimPoint sNext;
            if (!lumo::sim::ProjectInto(sBlock.asScenes[static_cast<std::size_t>(nNext)], s, &sNext,
                                        0.02)) {
                continue;
            }
            const std::string osId = "T" + std::to_string(nTies++);
            const double dfZ = bKnownElevation ? s.dfZ : LUMO_NULL_VALUE;
            sBlock.AddTie(k, osId, s, dfZ);
            sBlock.AddTie(nNext, osId, sNext, dfZ);
            ++nFound;
        }
    }
};

}  // namespace support
}  // namespace lumo
