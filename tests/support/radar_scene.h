// A simulated radar scene with its segment, control points and generated
// radar model, for the radar tests and benchmarks.
#pragma once

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

// A scene, its segment, control points sampled from it and the radar model
// generated from them.
class RadarFixture {
  public:
    RadarFixture(const sim::RadarSceneParams& sParams, int nGcps, double dfMinHeight,
                 double dfMaxHeight)
        : m_oScene(sParams),
          m_psSegment(m_oScene.MakeSegment()),
          m_asGcps(m_oScene.SamplePoints(nGcps, 7, dfMinHeight, dfMaxHeight, 0.03)),
          m_psModel(RTCSGenModel(m_psSegment.get(), GeographicProjection(), "E",
                                 AsControlPoints(m_asGcps))) {}

    const sim::RadarScene& Scene() const { return m_oScene; }
    const EphemerisSeg_t& Segment() const { return *m_psSegment; }
    const RTCSInfo_t& Model() const { return *m_psModel; }
    const std::vector<sim::SimPoint>& Gcps() const { return m_asGcps; }

  private:
    sim::RadarScene m_oScene;
    RadarSegmentPtr m_psSegment;
    std::vector<sim::SimPoint> m_asGcps;
    RadarModelPtr m_psModel;
};

}  // namespace support
}  // namespace lumo
