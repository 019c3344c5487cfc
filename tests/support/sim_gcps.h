// Simulated control points as the parallel arrays the fitting functions take.
#pragma once

#include <vector>

#include "lumo_sim.h"

namespace lumo {
namespace support {

struct SimGcps {
    std::vector<double> p, l, x, y, z;  // pixel, line, ground X, Y, height
    explicit SimGcps(const std::vector<lumo::sim::SimPoint>& as) {
        for (const lumo::sim::SimPoint& s : as) {
            p.push_back(s.dfPixel);
            l.push_back(s.dfLine);
            x.push_back(s.dfX);
            y.push_back(s.dfY);
            z.push_back(s.dfZ);
        }
    }
    int Count() const { return static_cast<int>(p.size()); }
};

}  // namespace support
}  // namespace lumo
