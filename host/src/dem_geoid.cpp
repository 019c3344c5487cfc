// The global elevation model: the EGM96 geoid, read through PROJ from the
// grid that proj-data installs.

#include <cmath>
#include <cstddef>
#include <memory>
#include <string>
#include <vector>

#include <proj.h>

#include "dem.h"
#include "proj_definition.h"
#include "runtime.h"

namespace nova {
namespace dem {
namespace {

constexpr const char* kSourceFile = "host/src/dem_geoid.cpp";
constexpr const char* kDescription = "EGM96 geoid";
// The grid's name in current proj-data, then in older releases.
constexpr const char* kGridNames[] = {"us_nga_egm96_15.tif", "egm96_15.gtx"};
// Node spacing of the EGM96 grid, degrees.
constexpr double kNodeSpacing = 0.25;
constexpr int kNodeCols = 1440;  // longitudes -180 to 179.75, wrapping
constexpr int kNodeRows = 721;   // latitudes 90 down to -90
constexpr double kDegToRad = M_PI / 180.0;

using detail::ContextPtr;
using detail::PJPtr;
// A PROJ operation that adds the geoid undulation to a height, with its own
// context so that any thread may use it. Null when no grid is installed.
struct GeoidShift {
    ContextPtr poCtx;
    PJPtr poShift;

    static GeoidShift Open() {
        GeoidShift sShift;
        sShift.poCtx.reset(proj_context_clone(detail::ThreadProjContext()));
        if (!sShift.poCtx) return sShift;
        proj_context_set_enable_network(sShift.poCtx.get(), 0);
        proj_log_level(sShift.poCtx.get(), PJ_LOG_NONE);
        for (const char* pszGrid : kGridNames) {
            const std::string osPipeline =
                std::string("+proj=vgridshift +multiplier=1 +grids=") + pszGrid;
            sShift.poShift.reset(proj_create(sShift.poCtx.get(), osPipeline.c_str()));
            if (sShift.poShift && sShift.Undulation(0.0, 0.0) != HUGE_VAL) break;
            sShift.poShift.reset();
        }
        return sShift;
    }

    // Undulation at a longitude and latitude in degrees; HUGE_VAL on failure.
    double Undulation(double dfLon, double dfLat) const {
        proj_errno_reset(poShift.get());
        const PJ_COORD sOut = proj_trans(
            poShift.get(), PJ_FWD, proj_coord(dfLon * kDegToRad, dfLat * kDegToRad, 0.0, HUGE_VAL));
        if (proj_errno(poShift.get()) != 0 || !std::isfinite(sOut.xyz.z)) return HUGE_VAL;
        return sOut.xyz.z;
    }
};

// Reads undulations at the grid nodes; bilinear sampling between the nodes
// then gives what PROJ itself interpolates.
void ReadUndulations(int nCol0, int nRow0, int nCols, int nRows, float* pafOut) {
    const GeoidShift sShift = GeoidShift::Open();
    if (!sShift.poShift) {
        throw DataException("The EGM96 geoid grid can no longer be read", kSourceFile,
                            __PRETTY_FUNCTION__, __LINE__);
    }
    for (int r = 0; r < nRows; ++r) {
        const double dfLat = 90.0 - (nRow0 + r) * kNodeSpacing;
        for (int c = 0; c < nCols; ++c) {
            const double dfN = sShift.Undulation(-180.0 + (nCol0 + c) * kNodeSpacing, dfLat);
            pafOut[static_cast<std::size_t>(r) * nCols + c] =
                dfN == HUGE_VAL ? std::nanf("") : static_cast<float>(dfN);
        }
    }
}

// Heights above mean sea level on the geoid surface: 0 wherever a position
// is on Earth.
class SeaLevelDEM final : public IRasterDEM {
  public:
    explicit SeaLevelDEM(ogc::CRSPtr poCRS) : mpoCRS(std::move(poCRS)) {}

    const ogc::cs::ICRS* GetCRS() const override { return mpoCRS.get(); }
    DEMExtent GetCoverage() const override { return DEMExtent{-180.0, -90.0, 180.0, 90.0}; }
    std::string GetDescription() const override { return kDescription; }
    void Release() override { delete this; }

    bool GetHeight(double dfX, double dfY, double& dfHeight) const override {
        if (!std::isfinite(dfX) || !(std::fabs(dfY) <= 90.0)) return false;
        dfHeight = 0.0;
        return true;
    }

    int GetHeights(int nCount, const double* padfX, const double* padfY,
                   double* padfHeight) const override {
        int nFound = 0;
        for (int i = 0; i < nCount; ++i) {
            padfHeight[i] = kNoHeight;
            if (GetHeight(padfX[i], padfY[i], padfHeight[i])) ++nFound;
        }
        return nFound;
    }

  private:
    ~SeaLevelDEM() override = default;
    ogc::CRSPtr mpoCRS;
};

IRasterDEM* CreateUndulationDEM(int nCacheMegabytes) {
    ogc::CRSPtr poCRS(ogc::ProjectionEngine::GetCSAuthorityFactory(ogc::kProjectionEngineProj)
                          ->CreateWGS84Ellipsoidal());
    GridLayout sLayout;
    sLayout.nCols = kNodeCols;
    sLayout.nRows = kNodeRows;
    sLayout.dfOriginX = -180.0;
    sLayout.dfOriginY = 90.0;
    sLayout.dfStepX = kNodeSpacing;
    sLayout.dfStepY = -kNodeSpacing;
    sLayout.bWrapsLongitude = true;
    sLayout.sCoverage = DEMExtent{-180.0, -90.0, 180.0, 90.0};
    return CreateGridDEM(std::move(poCRS), sLayout, ReadUndulations,
                         static_cast<std::size_t>(nCacheMegabytes) << 20, kDescription);
}

}  // namespace

IRasterDEM* DEMFactory::CreateGlobalDEM(bool bEllipsoidalHeights, int nCacheMegabytes) {
    if (nCacheMegabytes < 1) {
        throw ParameterException(
            "nCacheMegabytes", 1, "", "",
            FormatString("Invalid elevation cache size %d MB (at least 1)", nCacheMegabytes),
            kSourceFile, __PRETTY_FUNCTION__, __LINE__);
    }
    if (!GeoidShift::Open().poShift) {
        if (diag::Debugger::GetDebugLevel() != 0) {
            diag::Debugger::Debug("EGM96 geoid grid not installed (proj-data)", 1, "nova",
                                  kSourceFile, __LINE__);
        }
        return nullptr;
    }
    if (bEllipsoidalHeights) return CreateUndulationDEM(nCacheMegabytes);
    ogc::CRSPtr poHorizontal(ogc::utils::CreateCRSFromDefinition("EPSG:4326"));
    ogc::CRSPtr poCRS(ogc::utils::CreateCompoundCS(poHorizontal.get(), ogc::cs::CS_VD_Orthometric));
    return new SeaLevelDEM(std::move(poCRS));
}

}  // namespace dem
}  // namespace nova
