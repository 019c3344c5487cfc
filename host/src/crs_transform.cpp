// Point transformations between coordinate reference systems, on PROJ.

#include <cmath>
#include <memory>
#include <mutex>
#include <string>
#include <utility>

#include <proj.h>

#include "crs.h"
#include "proj_definition.h"
#include "runtime.h"

namespace nova {
namespace ogc {
namespace {

constexpr const char* kSourceFile = "host/src/crs_transform.cpp";

using detail::ContextPtr;
using detail::PJPtr;
struct OperationListDeleter {
    void operator()(PJ_OBJ_LIST* poList) const { proj_list_destroy(poList); }
};
using OperationListPtr = std::unique_ptr<PJ_OBJ_LIST, OperationListDeleter>;

struct FactoryContextDeleter {
    void operator()(PJ_OPERATION_FACTORY_CONTEXT* poFactory) const {
        proj_operation_factory_context_destroy(poFactory);
    }
};
using FactoryContextPtr = std::unique_ptr<PJ_OPERATION_FACTORY_CONTEXT, FactoryContextDeleter>;

bool AllFinite(double dfX, double dfY, double dfZ) {
    return std::isfinite(dfX) && std::isfinite(dfY) && std::isfinite(dfZ);
}

// PROJ passes latitudes beyond the poles through some operations unchanged;
// such points are rejected rather than reported as transformed.
bool ValidPoint(bool bGeographic, double dfX, double dfY, double dfZ) {
    return AllFinite(dfX, dfY, dfZ) && (!bGeographic || std::fabs(dfY) <= 90.0);
}

struct Sides {
    bool bSourceGeographic;
    bool bTargetGeographic;
};

// A transformation owns its PROJ context, so it does not depend on the
// thread that made it; a lock serialises the calls, since PROJ operations
// keep per-call state.
class ProjTransform final : public ct::IMathTransform {
  public:
    ProjTransform(ContextPtr poCtx, PJPtr poOperation, Sides sSides)
        : mpoCtx(std::move(poCtx)), mpoOperation(std::move(poOperation)), msSides(sSides) {}

    bool TransformPoint(double dfX, double dfY, double dfZ, double& dfOutX, double& dfOutY,
                        double& dfOutZ) const override {
        if (!ValidPoint(msSides.bSourceGeographic, dfX, dfY, dfZ)) return false;
        // HUGE_VAL time: the point has no epoch.
        const PJ_COORD sIn = proj_coord(dfX, dfY, dfZ, HUGE_VAL);
        PJ_COORD sOut;
        {
            std::lock_guard<std::mutex> oLock(moMutex);
            proj_errno_reset(mpoOperation.get());
            sOut = proj_trans(mpoOperation.get(), PJ_FWD, sIn);
            if (proj_errno(mpoOperation.get()) != 0) return false;
        }
        if (!ValidPoint(msSides.bTargetGeographic, sOut.xyz.x, sOut.xyz.y, sOut.xyz.z)) {
            return false;
        }
        dfOutX = sOut.xyz.x;
        dfOutY = sOut.xyz.y;
        dfOutZ = sOut.xyz.z;
        return true;
    }

    void Release() override { delete this; }

  private:
    ~ProjTransform() override = default;

    // Declared before the operation so that the operation goes first.
    ContextPtr mpoCtx;
    PJPtr mpoOperation;
    Sides msSides;
    mutable std::mutex moMutex;
};

bool HasHeights(const cs::ICRS* poCrs) {
    return poCrs->GetVerticalDatumType() != cs::CS_VD_None;
}

bool IsOrthometric(const cs::ICRS* poCrs) {
    return poCrs->GetVerticalDatumType() == cs::CS_VD_Orthometric;
}

// Geoid heights on one side and ellipsoidal heights on the other can only be
// related through a geoid model.
bool NeedsGeoidModel(const cs::ICRS* poFrom, const cs::ICRS* poTo) {
    return HasHeights(poFrom) && HasHeights(poTo) && IsOrthometric(poFrom) != IsOrthometric(poTo);
}

bool UsesAvailableGrid(PJ_CONTEXT* poCtx, const PJ* poOperation) {
    const int nGrids = proj_coordoperation_get_grid_used_count(poCtx, poOperation);
    if (nGrids <= 0) return false;
    for (int i = 0; i < nGrids; ++i) {
        int bAvailable = 0;
        if (proj_coordoperation_get_grid_used(poCtx, poOperation, i, nullptr, nullptr, nullptr,
                                              nullptr, nullptr, nullptr, &bAvailable) == 0 ||
            bAvailable == 0) {
            return false;
        }
    }
    return true;
}

// True when some candidate operation between the two systems applies an
// installed grid (the geoid model). Without one PROJ would fall back to an
// operation that copies heights unchanged, off by the geoid undulation.
bool GeoidModelAvailable(PJ_CONTEXT* poCtx, const PJ* poFrom, const PJ* poTo) {
    FactoryContextPtr poFactory(proj_create_operation_factory_context(poCtx, nullptr));
    if (!poFactory) return false;
    proj_operation_factory_context_set_grid_availability_use(
        poCtx, poFactory.get(), PROJ_GRID_AVAILABILITY_DISCARD_OPERATION_IF_MISSING_GRID);
    proj_operation_factory_context_set_spatial_criterion(
        poCtx, poFactory.get(), PROJ_SPATIAL_CRITERION_PARTIAL_INTERSECTION);
    OperationListPtr poList(proj_create_operations(poCtx, poFrom, poTo, poFactory.get()));
    if (!poList) return false;
    const int nCount = proj_list_get_count(poList.get());
    for (int i = 0; i < nCount; ++i) {
        PJPtr poOperation(proj_list_get(poCtx, poList.get(), i));
        if (poOperation && UsesAvailableGrid(poCtx, poOperation.get())) return true;
    }
    return false;
}

PJPtr CreateOperation(PJ_CONTEXT* poCtx, const PJ* poFrom, const PJ* poTo, double dfAccuracy) {
    const std::string osAccuracy = FormatString("ACCURACY=%.17g", dfAccuracy);
    const char* apszOptions[] = {osAccuracy.c_str(), nullptr};
    PJPtr poOperation(proj_create_crs_to_crs_from_pj(poCtx, poFrom, poTo, nullptr,
                                                     dfAccuracy > 0.0 ? apszOptions : nullptr));
    if (!poOperation) return nullptr;
    // Longitude/easting first, whatever the axis order of the definitions.
    return PJPtr(proj_normalize_for_visualization(poCtx, poOperation.get()));
}

}  // namespace

namespace utils {

ct::IMathTransform* CreateCRSTransform(const cs::ICRS* poFrom, const cs::ICRS* poTo,
                                       double dfAccuracy) {
    if (!std::isfinite(dfAccuracy) || dfAccuracy < 0.0) {
        throw ParameterException("dfAccuracy", 1, "", "",
                                 FormatString("Invalid transformation accuracy %g", dfAccuracy),
                                 kSourceFile, __PRETTY_FUNCTION__, __LINE__);
    }
    if (poFrom == nullptr || poTo == nullptr) return nullptr;

    // A context of its own, with the settings (search paths, logging) of the
    // calling thread's context and never any network access.
    ContextPtr poCtx(proj_context_clone(detail::ThreadProjContext()));
    if (!poCtx) return nullptr;
    proj_context_set_enable_network(poCtx.get(), 0);

    PJPtr poSource(proj_create(poCtx.get(), poFrom->GetDefinition().c_str()));
    PJPtr poTarget(proj_create(poCtx.get(), poTo->GetDefinition().c_str()));
    if (!poSource || !poTarget) return nullptr;
    if (NeedsGeoidModel(poFrom, poTo) &&
        !GeoidModelAvailable(poCtx.get(), poSource.get(), poTarget.get())) {
        return nullptr;
    }
    PJPtr poOperation = CreateOperation(poCtx.get(), poSource.get(), poTarget.get(), dfAccuracy);
    if (!poOperation) return nullptr;
    // The systems are no longer needed; the operation stays with its context.
    poSource.reset();
    poTarget.reset();
    return new ProjTransform(std::move(poCtx), std::move(poOperation),
                             Sides{poFrom->IsGeographic(), poTo->IsGeographic()});
}

}  // namespace utils
}  // namespace ogc
}  // namespace nova
