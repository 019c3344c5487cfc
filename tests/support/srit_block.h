// The arrays of one block adjustment (SRITCalculateN) over simulated scenes,
// filled observation by observation; shared by the block tests and the block
// benchmark.
#pragma once

#include <string>
#include <vector>

#include "lumo_ephemeris.h"
#include "lumo_sim.h"
#include "lumo_srit.h"

namespace lumo {
namespace support {

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

}  // namespace support
}  // namespace lumo
