// Owning pointers for the model records of the C interface, and the small
// record set-ups shared by tests and benchmarks.
#pragma once

#include <array>
#include <cmath>
#include <cstring>
#include <memory>
#include <string>

#include "lumo.h"

namespace lumo {
namespace support {

// Releases a record with its family's release function.
template <typename T, void (*Release)(T*)>
struct Releaser {
    void operator()(T* p) const { Release(p); }
};

using PolyPtr = std::unique_ptr<POLYInfo_t, Releaser<POLYInfo_t, POLYDeallocate>>;
using TpsPtr = std::unique_ptr<TPSMInfo_t, Releaser<TPSMInfo_t, TPSDeallocate>>;
using RfPtr = std::unique_ptr<RFInfo_t, Releaser<RFInfo_t, RFDeallocate>>;
using SritPtr = std::unique_ptr<SRITInfo_t, Releaser<SRITInfo_t, LumoFreeSRITInfo>>;
using SegmentPtr = std::unique_ptr<EphemerisSeg_t, Releaser<EphemerisSeg_t, LumoSatEphemerisFree>>;
using TrnPtr = std::unique_ptr<TRNInfo_t, Releaser<TRNInfo_t, TRNDeallocate>>;
using ApPtr = std::unique_ptr<APInfo_t, Releaser<APInfo_t, APDeallocate>>;

// A new rational function record of nTerms terms, all coefficients zero.
inline RfPtr AllocateRf(int nTerms) {
    return RfPtr(RFAllocate(nullptr, nTerms));
}

// Normalisation of a frame-like scene of about 10 000 x 10 000 pixels near
// 7.45 E 46.95 N, heights 300 to 1300 m.
inline void SetRfSceneFrame(RFInfo_t& rf) {
    rf.dfXOffset = 7.45;
    rf.dfXScale = 0.16;
    rf.dfYOffset = 46.95;
    rf.dfYScale = 0.11;
    rf.dfZOffset = 800.0;
    rf.dfZScale = 500.0;
    rf.dfPixelOffset = 5074.5;
    rf.dfPixelScale = 5000.0;
    rf.dfLineOffset = 4961.5;
    rf.dfLineScale = 5000.0;
}

// A frame-like scene near 7.45 E 46.95 N: mostly linear, with cubic terms
// and a first-order denominator as a perspective view has.
inline RfPtr RfSceneModel() {
    RfPtr psRF = AllocateRf(20);
    SetRfSceneFrame(*psRF);
    const std::array<double, 20> adfPixelNum = {0.002, 1.2,   0.05, 0.012, 0.003, 1e-4,  2e-4,
                                                4e-3,  -2e-3, 1e-5, 1e-6,  3e-4,  -2e-4, 1e-6,
                                                2e-4,  1e-4,  2e-6, -1e-6, 3e-6,  1e-7};
    const std::array<double, 20> adfLineNum = {-0.001, 0.04, -1.21, 0.004, -0.002, 1e-4, -3e-4,
                                               1e-3,   3e-3, 2e-5,  -1e-6, 1e-4,   2e-4, 1e-6,
                                               -1e-4,  2e-4, 1e-6,  2e-6,  -2e-6,  -1e-7};
    for (int i = 0; i < 20; ++i) {
        psRF->padfPixelNum[i] = adfPixelNum[i];
        psRF->padfLineNum[i] = adfLineNum[i];
    }
    psRF->padfPixelDen[0] = psRF->padfLineDen[0] = 1.0;
    psRF->padfPixelDen[1] = psRF->padfLineDen[1] = 0.01;
    psRF->padfPixelDen[2] = psRF->padfLineDen[2] = -0.02;
    psRF->padfPixelDen[3] = psRF->padfLineDen[3] = 0.001;
    return psRF;
}

// The first difference between the rational functions of two records, ""
// when none: the ten offsets and scales and the 20 coefficients of each
// polynomial, equal within a relative dfRel (0: bit for bit).
inline std::string RfDifference(const RFInfo_t& a, const RFInfo_t& b, double dfRel = 0.0) {
    const auto differ = [dfRel](double x, double y) {
        return x != y && !(std::fabs(x - y) <= dfRel * std::fabs(x));
    };
    for (int k = 0; k < 10; ++k) {
        if (differ((&a.dfXOffset)[k], (&b.dfXOffset)[k]))
            return "offset/scale " + std::to_string(k);
    }
    const double* apdfA[] = {a.padfPixelNum, a.padfPixelDen, a.padfLineNum, a.padfLineDen};
    const double* apdfB[] = {b.padfPixelNum, b.padfPixelDen, b.padfLineNum, b.padfLineDen};
    for (int j = 0; j < 4; ++j) {
        for (int i = 0; i < RF_MAX_TERMS; ++i) {
            if (differ(apdfA[j][i], apdfB[j][i])) {
                return "polynomial " + std::to_string(j) + " term " + std::to_string(i);
            }
        }
    }
    return "";
}

// Fiducial transforms of an aerial photo: photo -> image (d) and
// image -> photo (e), eight coefficients each.
inline void SetFiducials(APInfo_t& ap, const double (&d)[8], const double (&e)[8]) {
    std::memcpy(ap.adfPhotoToImage, d, sizeof d);
    std::memcpy(ap.adfImageToPhoto, e, sizeof e);
}

// The camera of a frame photo apart from its attitude and fiducials.
struct FrameCamera {
    double dfFocalLength;
    double dfCameraX, dfCameraY, dfCameraZ;
    double dfPrincipalX, dfPrincipalY;
    double dfRadial3, dfRadial5;            // radial distortion k3 and k5
    double dfDecentering1, dfDecentering2;  // decentering p1 and p2
    double dfEarthRadius;
    // Corrections switched on, one bit each: 1 principal point, 2 radial
    // distortion, 4 decentering, 8 Earth curvature, 16 refraction.
    unsigned nCorrections;
};

inline void SetFrameCamera(APInfo_t& ap, const FrameCamera& cam) {
    ap.dfFocalLength = cam.dfFocalLength;
    ap.dfCameraX = cam.dfCameraX;
    ap.dfCameraY = cam.dfCameraY;
    ap.dfCameraZ = cam.dfCameraZ;
    ap.dfPrincipalX = cam.dfPrincipalX;
    ap.dfPrincipalY = cam.dfPrincipalY;
    ap.adfRadial[3] = cam.dfRadial3;
    ap.adfRadial[5] = cam.dfRadial5;
    ap.adfDecentering[0] = cam.dfDecentering1;
    ap.adfDecentering[1] = cam.dfDecentering2;
    ap.dfEarthRadius = cam.dfEarthRadius;
    ap.bPrincipalPoint = (cam.nCorrections & 1u) ? 1 : 0;
    ap.bRadialDistortion = (cam.nCorrections & 2u) ? 1 : 0;
    ap.bDecentering = (cam.nCorrections & 4u) ? 1 : 0;
    ap.bEarthCurvature = (cam.nCorrections & 8u) ? 1 : 0;
    ap.bRefraction = (cam.nCorrections & 16u) ? 1 : 0;
}

}  // namespace support
}  // namespace lumo
