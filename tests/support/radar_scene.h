// A simulated radar scene with its segment, control points and generated
// radar model, and the accuracy figures the radar tests and benchmarks
// measure on it.
#pragma once

#include <algorithm>
#include <cmath>
#include <memory>
#include <vector>

#include "lumo.h"
#include "radar_sim.h"
#include "rpc.h"

namespace lumo {
namespace support {

struct RadarModelDeleter {
    void operator()(RTCSInfo_t* p) const { RTCSFreeModel(p); }
};
using RadarModelPtr = std::unique_ptr<RTCSInfo_t, RadarModelDeleter>;

struct RadarSegmentDeleter {
    void operator()(EphemerisSeg_t* p) const { LumoSatEphemerisFree(p); }
};
using RadarSegmentPtr = std::unique_ptr<EphemerisSeg_t, RadarSegmentDeleter>;

struct RadarFigures {
    double dfCheckRms = 0.0;  // ground to image against the truth, pixels
    double dfCheckMax = 0.0;
    double dfRoundTripMax = 0.0;     // image -> ground -> image, pixels
    double dfOwnRoundTripMax = 0.0;  // the same on the model's own geometry
    double dfRpcInsideMax = 0.0;     // rational polynomial against own geometry, in the raster
    double dfRpcGridMax = 0.0;       // the same over the whole fit grid (fit residual)
};

inline ProjInfo_t GeographicProjection() {
    ProjInfo_t s{};
    Geosys2ProjInfo(&s, "LONG/LAT D000", 0.0, 0.0, 1.0, 1.0);
    return s;
}

// Control points as the model takes them (ground X, Y = longitude, latitude).
inline std::vector<ControlPoint_t> AsControlPoints(const std::vector<sim::SimPoint>& asPoints) {
    std::vector<ControlPoint_t> ao;
    for (const sim::SimPoint& s : asPoints)
        ao.push_back({s.dfPixel, s.dfLine, s.dfX, s.dfY, s.dfZ});
    return ao;
}

class RadarFixture {
  public:
    RadarFixture(const sim::RadarSceneParams& sParams, int nGcps, double dfMinHeight,
                 double dfMaxHeight)
        : m_oScene(sParams), m_dfMinHeight(dfMinHeight), m_dfMaxHeight(dfMaxHeight) {
        m_psSegment.reset(m_oScene.MakeSegment());
        m_asGcps = m_oScene.SamplePoints(nGcps, 7, dfMinHeight, dfMaxHeight, 0.03);
        m_psModel.reset(RTCSGenModel(m_psSegment.get(), GeographicProjection(), "E",
                                     AsControlPoints(m_asGcps)));
    }

    const sim::RadarScene& Scene() const { return m_oScene; }
    const EphemerisSeg_t& Segment() const { return *m_psSegment; }
    const RTCSInfo_t& Model() const { return *m_psModel; }
    const std::vector<sim::SimPoint>& Gcps() const { return m_asGcps; }

    // The same model answering from its own geometry only.
    RadarModelPtr WithoutRpc() const {
        RadarModelPtr p(RTCSAllocate());
        RTCSCopy(p.get(), m_psModel.get());
        delete p->poRpcModel;
        p->poRpcModel = nullptr;
        return p;
    }

    RadarFigures Measure(int nChecks, double dfRpcMinHeight, double dfRpcMaxHeight) const {
        RadarFigures r;
        RadarModelPtr psOwn = WithoutRpc();
        const std::vector<sim::SimPoint> asChecks =
            m_oScene.SamplePoints(nChecks, 99, m_dfMinHeight, m_dfMaxHeight, 0.01);
        double dfSum = 0.0;
        for (const sim::SimPoint& s : asChecks) {
            double p = 0, l = 0;
            RTCSGeo2Img(m_psModel.get(), s.dfX, s.dfY, s.dfZ, &p, &l);
            const double e = std::hypot(p - s.dfPixel, l - s.dfLine);
            dfSum += e * e;
            r.dfCheckMax = std::max(r.dfCheckMax, e);
            double x = 0, y = 0, p2 = 0, l2 = 0;
            const bool bOk =
                RTCSImg2Geo(m_psModel.get(), s.dfPixel, s.dfLine, s.dfZ, &x, &y) == 1 &&
                RTCSGeo2Img(m_psModel.get(), x, y, s.dfZ, &p2, &l2) == 1;
            r.dfRoundTripMax =
                std::max(r.dfRoundTripMax, bOk ? std::hypot(p2 - s.dfPixel, l2 - s.dfLine) : 1e9);
            const bool bOwn = RTCSImg2Geo(psOwn.get(), s.dfPixel, s.dfLine, s.dfZ, &x, &y) == 1 &&
                              RTCSGeo2Img(psOwn.get(), x, y, s.dfZ, &p2, &l2) == 1;
            r.dfOwnRoundTripMax = std::max(r.dfOwnRoundTripMax,
                                           bOwn ? std::hypot(p2 - s.dfPixel, l2 - s.dfLine) : 1e9);
        }
        r.dfCheckRms = std::sqrt(dfSum / std::max<std::size_t>(asChecks.size(), 1));

        const std::vector<sim::SimPoint> asInside =
            m_oScene.SamplePoints(400, 5, dfRpcMinHeight, dfRpcMaxHeight, 0.0);
        for (const sim::SimPoint& s : asInside) {
            double lon = 0, lat = 0, p1 = 0, l1 = 0, p2 = 0, l2 = 0;
            // A ground point of the raster at this height, by the model itself.
            if (RTCSImg2Geo(psOwn.get(), s.dfPixel, s.dfLine, s.dfZ, &lon, &lat) != 1) continue;
            if (m_psModel->poRpcModel == nullptr ||
                m_psModel->poRpcModel->GroundToImage(lon, lat, s.dfZ, p1, l1, false) != 0) {
                r.dfRpcInsideMax = 1e9;
                continue;
            }
            RTCSGeo2Img(psOwn.get(), lon, lat, s.dfZ, &p2, &l2);
            r.dfRpcInsideMax = std::max(r.dfRpcInsideMax, std::hypot(p1 - p2, l1 - l2));
        }
        if (m_psModel->poRpcModel != nullptr) {
            const auto& rep = m_psModel->poRpcModel->GetFitReport();
            r.dfRpcGridMax = std::max(rep.dfMaxPixel, rep.dfMaxLine);
        }
        return r;
    }

  private:
    sim::RadarScene m_oScene;
    double m_dfMinHeight;
    double m_dfMaxHeight;
    RadarSegmentPtr m_psSegment;
    std::vector<sim::SimPoint> m_asGcps;
    RadarModelPtr m_psModel;
};

}  // namespace support
}  // namespace lumo
