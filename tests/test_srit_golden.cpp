// Bit-exact golden check of the rigorous adjustment: one fingerprint per
// sensor family and parameter layout (optical 8/11/12/13 unknowns, radar
// 9/13, flat and linear groups, per-line tables with level conversion, lens
// correction, constraints) and one for a block with tie points. Any change to
// the arithmetic of the adjustment changes a fingerprint; a deliberate change
// of results must update the value printed on failure.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include "lumo_ephemeris.h"
#include "lumo_sim.h"
#include "lumo_srit.h"
#include "runtime.h"
#include "support/model_records.h"
#include "support/segments.h"
#include "support/sim_gcps.h"
#include "support/srit_block.h"

namespace {

using lumo::sim::Scene;
using lumo::sim::SceneParams;

// FNV-1a over the bytes of what the adjustment wrote.
struct Fingerprint {
    std::uint64_t h = 1469598103934665603ULL;
    void Add(const void* pv, std::size_t n) {
        const auto* p = static_cast<const unsigned char*>(pv);
        for (std::size_t i = 0; i < n; ++i) h = (h ^ p[i]) * 1099511628211ULL;
    }
    void Add(const SRITInfo_t& s) {
        Add(s.adfCoef, sizeof s.adfCoef);
        Add(s.Sensor, sizeof s.Sensor);
        Add(&s.nSensor, sizeof s.nSensor);
        Add(&s.nModelClass, sizeof s.nModelClass);
    }
};

// A per-line table of small along- and across-track offsets.
void AddLineTable(EphemerisSeg_t* psSeg, int nLines) {
    AttitudeData_t* psTable = lumo::support::AttachLineTable(psSeg, nLines);
    psTable->dfAttitude1 = 1e-6;
    psTable->dfAttitude2 = -2e-6;
    psTable->dfAttitude3 = 5e-7;
    for (int i = 0; i < nLines; ++i) {
        psTable->pAttitudeLines[i] = {0.5 * std::sin(i * 1e-3), -0.3 * std::cos(i * 2e-3)};
    }
}

struct Case {
    const char* pszSensor;
    int nPoints;
    double dfRoll;
    bool bConstrained;
    bool bLineTable;  // attitude record with a per-line table
    int nLevelForm;   // level conversion form (20: a near-identity cubic)
    std::uint64_t nFingerprint;
};

std::uint64_t FitFingerprint(const Case& c) {
    SceneParams s;
    s.osSensorName = c.pszSensor;
    s.dfRollDeg = c.dfRoll;
    s.bConstrained = c.bConstrained;
    s.nPixels = s.nLines = 6000;
    const Scene sScene(s);
    const lumo::support::SimGcps g(sScene.SamplePoints(c.nPoints, 17, 0.0, 1800.0));
    EphemerisSeg_t* psSeg = sScene.MakeSegment();
    if (c.bLineTable) AddLineTable(psSeg, s.nLines);
    if (c.nLevelForm == 20) {
        psSeg->nLevelConvForm = 20;
        double* K = psSeg->adfLevelConvCoefs;
        K[1] = K[5] = K[9] = K[13] = 1.0;
        K[17] = 1e-7;  // a slight shear so the conversion is not the identity
    }
    lumo::support::SritPtr psModel(SRITAllocate());
    if (SRITCalculate(psModel.get(), true, psSeg, g.Count(), &sScene.Projection(), g.p.data(),
                      g.l.data(), g.z.data(), g.x.data(), g.y.data()) != 1) {
        LumoSatEphemerisFree(psSeg);
        return 0;
    }
    for (double dfCoef : psModel->adfCoef) EXPECT_TRUE(std::isfinite(dfCoef)) << c.pszSensor;
    Fingerprint f;
    f.Add(*psModel);
    return f.h;
}

TEST(SRITGolden, OneImageCoefficientsAreBitExact) {
    const Case asCases[] = {
        {"SPOT5_PAN_5", 5, 0.0, false, false, 0, 0xd858c0b7cc3ef5df},    // optical, 8 unknowns
        {"SPOT5_PAN_5", 9, 12.0, false, false, 0, 0x414f56910c853ff2},   // optical, 12 unknowns
        {"SPOT5_PAN_2_5", 9, -8.0, true, false, 0, 0x78b46d033dcd0f1d},  // class 4, constrained
        {"IRIS", 12, 5.0, false, false, 0, 0x12e42701ea3ac7e8},       // optical, 13 unknowns (P12)
        {"SAR", 6, 20.0, false, false, 0, 0x2405d12a29011549},        // radar layout, 9 unknowns
        {"SAR", 9, 25.0, false, false, 0, 0x929e835a3ce38bc2},        // radar layout, 13 unknowns
        {"TM", 8, 0.0, false, false, 0, 0x7c2f194084bd7733},          // flat, linear, constrained
        {"IKONOS", 8, 15.0, false, false, 0, 0xb06ae2d93a279c25},     // flat, linear, class 3
        {"LISS-L3-L2", 8, 3.0, false, false, 0, 0xdbbfb98fe7af05ce},  // flat, class 2
        {"FORMOSAT_PAN", 9, 4.0, false, false, 0, 0xfc6a823bd55a2031},  // lens correction, class 5
        {"PLA", 7, 2.0, false, true, 20, 0x7eae9e51f9bf44ac},  // line table and level conversion
        {"MLA", 7, -3.0, true, true, 0, 0x753aa48fcb07271a},   // line table, constrained
        {"QBIRD_PAN", 8, 18.0, false, false, 0, 0xa39d47dbe25fb55b},  // class 4, 12 unknowns
    };
    for (const Case& c : asCases) {
        const std::uint64_t h = FitFingerprint(c);
        EXPECT_EQ(h, c.nFingerprint)
            << c.pszSensor << " " << c.nPoints << ": got 0x" << std::hex << h;
    }
}

// Two views at +-15 degrees: control points in both (one without
// elevation), check observations, ties of unknown and of known elevation.
TEST(SRITGolden, BlockCoefficientsAndEstimatesAreBitExact) {
    lumo::sim::SceneParams sBase;
    sBase.nUtmZone = 31;
    lumo::support::Block sBlock;
    for (double dfRoll : {-15.0, 15.0})
        sBlock.AddImage(lumo::sim::AimAt(sBase, 45.0, 3.0, dfRoll, 0.0));
    const Scene sNadir(lumo::sim::AimAt(sBase, 45.0, 3.0, 0.0, 0.0));
    const auto fnAdd = [&](int n, const std::vector<lumo::sim::SimPoint>& as,
                           const lumo::sim::SimPoint& sGround) {
        const std::string osId = "p" + std::to_string(n);
        for (int k = 0; k < 2; ++k) {
            lumo::sim::SimPoint s = as[static_cast<std::size_t>(k)];
            if (n == 6) s.dfZ = LUMO_NULL_VALUE;
            if (n <= 6) sBlock.AddGcp(k, osId, s);
            if (n > 6 && n < 10) sBlock.AddGcp(k, osId, s, 'C');
            if (n >= 10) sBlock.AddTie(k, osId, s, n < 13 ? sGround.dfZ : LUMO_NULL_VALUE);
        }
    };
    sBlock.ForEachSeenByAll(sNadir.SamplePoints(24, 31, 0.0, 1500.0, 0.1), fnAdd);
    ASSERT_EQ(sBlock.Run(), 1);
    Fingerprint f;
    for (const SRITInfo_t* ps : sBlock.apsModels) f.Add(*ps);
    for (const auto* pv : {&sBlock.adfTieX, &sBlock.adfTieY, &sBlock.adfTieZ}) {
        f.Add(pv->data(), pv->size() * sizeof(double));
    }
    for (const auto& adf : sBlock.adfOut) f.Add(adf.data(), adf.size() * sizeof(double));
    EXPECT_EQ(f.h, 0xbf479dc414954070ULL) << "got 0x" << std::hex << f.h;
}

}  // namespace
