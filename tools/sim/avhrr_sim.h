// AVHRR pass simulator: an ephemeris segment with the orbit header text
// fields (epoch, clock offset, Greenwich angle, mean elements) and the
// scan-line time codes of a pass, made from mean orbital elements and a
// start time; and control points of a pass whose true geometry differs from
// the nominal one by attitude and orbit biases, for the orbit model's tests,
// the demo and the lumo tool.
#pragma once

#include <cstdint>
#include <vector>

#include "lumo_lrs.h"
#include "lumo_types.h"

namespace lumo::sim {

// The pass (by default a morning descending pass over Europe in June).
// Angles in degrees, lengths in kilometres, times in seconds.
struct AvhrrPassSpec {
    int nEpochYear = 2004;
    int nEpochDay = 167;  // day of the year of the element epoch, 1..366
    double dfEpochSecondOfDay = 36000.0;
    // Mean (Brouwer) elements at the epoch.
    double dfSemiMajorAxis = 7229.86;
    double dfEccentricity = 0.0011;
    double dfInclination = 98.75;
    double dfNode = 242.0;
    double dfPerigee = 90.0;
    double dfMeanAnomaly = 11.0;
    double dfStartSeconds = 300.0;  // element epoch to the earliest scan line
    int nLines = 2400;              // scan lines, six a second
    bool bBackward = false;         // scan-line times decrease along the image
    double dfClockOffsetMs = 0.0;   // written to the header; the codes are shifted by it
};

// A new segment (host allocator; release with LumoSatEphemerisFree) holding
// the pass's AVHRR orbit header and scan lines. Throws std::invalid_argument
// naming a value that the header cannot hold.
EphemerisSeg_t* MakeAvhrrSegment(const AvhrrPassSpec& sSpec);

// Differences of the true pass from the nominal model.
struct AvhrrBias {
    double dfRollDeg = 0.0;       // roll offset
    double dfAlongTrackKm = 0.0;  // satellite ahead of its nominal position
    double dfPitchDeg = 0.0;
    double dfYawDeg = 0.0;
};

// The nominal model of a segment with the biases applied to its refinement
// values: the "true" geometry of a simulated pass.
void ApplyBias(const AvhrrBias& sBias, LRSOrbitModel_t* psModel);

// nCols x nRows control points on a regular grid over the image (a margin of
// dfMargin pixels or lines kept free at each edge), their ground positions
// from the model psTruth at heights drawn from [0, dfMaxHeight] metres,
// reproducible from nSeed. Points whose line of sight misses the Earth are
// left out.
std::vector<ControlPoint_t> SampleAvhrrPoints(const LRSOrbitModel_t& sTruth, int nCols, int nRows,
                                              double dfMargin, double dfMaxHeight,
                                              std::uint32_t nSeed);

}  // namespace lumo::sim
