// Coordinate reference systems on PROJ: the immutable CRS object, the
// factories of the PROJ engine and the construction of compound systems.

#include "crs.h"

#include <cctype>
#include <cmath>
#include <cstring>
#include <memory>
#include <string>
#include <utility>

#include <proj.h>
#include <proj_experimental.h>
#include <nlohmann/json.hpp>

#include "proj_definition.h"
#include "runtime.h"

namespace nova {
namespace ogc {
namespace {

using cs::DatumType;

constexpr const char* kSourceFile = "host/src/crs.cpp";
// Vertical system of heights above mean sea level: EGM96 geoid heights.
constexpr const char* kGeoidHeightCode = "5773";
constexpr const char* kWGS84EllipsoidalCode = "4979";
// Longest piece of a user text quoted in an error message.
constexpr std::size_t kQuotedTextLength = 80;

using detail::PJPtr;
[[noreturn]] void ThrowParameter(const char* pszName, const std::string& osMessage,
                                 const char* pszFunction, int nLine) {
    throw ParameterException(pszName, 1, "", "", osMessage, kSourceFile, pszFunction, nLine);
}

std::string Quoted(const std::string& osText) {
    if (osText.size() <= kQuotedTextLength) return "'" + osText + "'";
    return "'" + osText.substr(0, kQuotedTextLength) + "...'";
}

std::string TextOrEmpty(const char* pszText) {
    return pszText != nullptr ? pszText : "";
}

// What a CRS object keeps: its texts and its kind, worked out once.
struct CRSDescription {
    std::string osName;
    std::string osWkt;
    std::string osProj4;
    std::string osDefinition;  // WKT2, or PROJJSON when WKT cannot express it
    bool bGeographic = false;
    bool bProjected = false;
    bool bCompound = false;
    DatumType eVertical = cs::CS_VD_None;
};

class ProjCRS final : public cs::ICRS {
  public:
    explicit ProjCRS(CRSDescription sDescription) : msDescription(std::move(sDescription)) {}

    ICRS* Clone() const override { return new ProjCRS(*this); }
    void Release() override { delete this; }
    std::string GetName() const override { return msDescription.osName; }
    std::string ExportToWkt() const override { return msDescription.osWkt; }
    std::string ExportToProj4() const override { return msDescription.osProj4; }
    std::string GetDefinition() const override { return msDescription.osDefinition; }
    bool IsGeographic() const override { return msDescription.bGeographic; }
    bool IsProjected() const override { return msDescription.bProjected; }
    bool IsCompound() const override { return msDescription.bCompound; }
    DatumType GetVerticalDatumType() const override { return msDescription.eVertical; }

  private:
    ProjCRS(const ProjCRS&) = default;
    ~ProjCRS() override = default;

    CRSDescription msDescription;
};

int AxisCount(PJ_CONTEXT* poCtx, const PJ* poCrs) {
    PJPtr poCs(proj_crs_get_coordinate_system(poCtx, poCrs));
    return poCs ? proj_cs_get_axis_count(poCtx, poCs.get()) : 0;
}

// Kind of the horizontal part and the vertical datum of a CRS.
void Classify(PJ_CONTEXT* poCtx, const PJ* poCrs, CRSDescription& sOut) {
    switch (proj_get_type(poCrs)) {
        case PJ_TYPE_GEOGRAPHIC_2D_CRS:
            sOut.bGeographic = true;
            break;
        case PJ_TYPE_GEOGRAPHIC_3D_CRS:
            sOut.bGeographic = true;
            sOut.eVertical = cs::CS_VD_Ellipsoidal;
            break;
        case PJ_TYPE_PROJECTED_CRS:
            sOut.bProjected = true;
            if (AxisCount(poCtx, poCrs) == 3) sOut.eVertical = cs::CS_VD_Ellipsoidal;
            break;
        case PJ_TYPE_VERTICAL_CRS:
            sOut.eVertical = cs::CS_VD_Orthometric;
            break;
        case PJ_TYPE_BOUND_CRS: {
            PJPtr poBase(proj_get_source_crs(poCtx, poCrs));
            if (poBase) Classify(poCtx, poBase.get(), sOut);
            break;
        }
        case PJ_TYPE_COMPOUND_CRS: {
            PJPtr poHorizontal(proj_crs_get_sub_crs(poCtx, poCrs, 0));
            PJPtr poVertical(proj_crs_get_sub_crs(poCtx, poCrs, 1));
            if (poHorizontal) Classify(poCtx, poHorizontal.get(), sOut);
            if (poVertical) Classify(poCtx, poVertical.get(), sOut);
            sOut.bCompound = true;
            break;
        }
        default:
            break;
    }
}

cs::ICRS* MakeCRS(PJ_CONTEXT* poCtx, const PJ* poCrs, bool bCompound) {
    CRSDescription sDescription;
    sDescription.osName = TextOrEmpty(proj_get_name(poCrs));
    sDescription.osWkt = TextOrEmpty(proj_as_wkt(poCtx, poCrs, PJ_WKT2_2019, nullptr));
    sDescription.osProj4 = TextOrEmpty(proj_as_proj_string(poCtx, poCrs, PJ_PROJ_5, nullptr));
    // WKT2 reads back without loss, usage areas of the members included.
    sDescription.osDefinition = sDescription.osWkt;
    if (sDescription.osDefinition.empty())
        sDescription.osDefinition = TextOrEmpty(proj_as_projjson(poCtx, poCrs, nullptr));
    Classify(poCtx, poCrs, sDescription);
    sDescription.bCompound = sDescription.bCompound || bCompound;
    return new ProjCRS(std::move(sDescription));
}

bool IsHorizontal2D(PJ_CONTEXT* poCtx, const PJ* poCrs) {
    switch (proj_get_type(poCrs)) {
        case PJ_TYPE_GEOGRAPHIC_2D_CRS:
            return true;
        case PJ_TYPE_PROJECTED_CRS:
            return AxisCount(poCtx, poCrs) == 2;
        case PJ_TYPE_BOUND_CRS: {
            PJPtr poBase(proj_get_source_crs(poCtx, poCrs));
            return poBase && IsHorizontal2D(poCtx, poBase.get());
        }
        default:
            return false;
    }
}

// The 2-D horizontal part of a CRS: itself, the first member of a compound
// system, or a 3-D system without its height axis. Null when there is none.
PJPtr HorizontalPart(PJ_CONTEXT* poCtx, const PJ* poCrs) {
    if (IsHorizontal2D(poCtx, poCrs)) return PJPtr(proj_clone(poCtx, poCrs));
    switch (proj_get_type(poCrs)) {
        case PJ_TYPE_COMPOUND_CRS: {
            PJPtr poFirst(proj_crs_get_sub_crs(poCtx, poCrs, 0));
            return poFirst ? HorizontalPart(poCtx, poFirst.get()) : nullptr;
        }
        case PJ_TYPE_GEOGRAPHIC_3D_CRS:
        case PJ_TYPE_PROJECTED_CRS:
        case PJ_TYPE_BOUND_CRS: {
            PJPtr poDemoted(proj_crs_demote_to_2D(poCtx, nullptr, poCrs));
            if (poDemoted && IsHorizontal2D(poCtx, poDemoted.get())) return poDemoted;
            return nullptr;
        }
        default:
            return nullptr;
    }
}

bool IsMetre(const cs::LinearUnit& oUnit) {
    return oUnit.GetMetresPerUnit() == 1.0;
}

// EPSG code of the common length units, so that exported definitions name
// them by code; null for others.
const char* UnitCode(const cs::LinearUnit& oUnit) {
    const double dfFactor = oUnit.GetMetresPerUnit();
    if (dfFactor == 1.0) return "9001";
    if (dfFactor == 0.3048) return "9002";
    if (dfFactor == 1200.0 / 3937.0) return "9003";
    return nullptr;
}

// Horizontal system plus EGM96 heights.
PJPtr MakeOrthometric(PJ_CONTEXT* poCtx, PJ* poHorizontal, const cs::LinearUnit& oUnit) {
    PJPtr poVertical(
        proj_create_from_database(poCtx, "EPSG", kGeoidHeightCode, PJ_CATEGORY_CRS, 0, nullptr));
    if (!poVertical) return nullptr;
    if (!IsMetre(oUnit)) {
        const char* pszCode = UnitCode(oUnit);
        poVertical.reset(proj_crs_alter_cs_linear_unit(
            poCtx, poVertical.get(), oUnit.GetName().c_str(), oUnit.GetMetresPerUnit(),
            pszCode != nullptr ? "EPSG" : nullptr, pszCode));
        if (!poVertical) return nullptr;
        const std::string osName =
            TextOrEmpty(proj_get_name(poVertical.get())) + " (" + oUnit.GetName() + ")";
        poVertical.reset(proj_alter_name(poCtx, poVertical.get(), osName.c_str()));
        if (!poVertical) return nullptr;
    }
    const std::string osName = TextOrEmpty(proj_get_name(poHorizontal)) + " + " +
                               TextOrEmpty(proj_get_name(poVertical.get()));
    return PJPtr(proj_create_compound_crs(poCtx, osName.c_str(), poHorizontal, poVertical.get()));
}

// Sets the unit of the height axis (the third) of a 3-D system given as
// PROJJSON; the horizontal axes keep theirs.
bool SetHeightUnit(nlohmann::json& oCrs, const cs::LinearUnit& oUnit) {
    nlohmann::json* poTarget = &oCrs;
    // A bound system carries its coordinate system in its source.
    if (poTarget->contains("source_crs")) poTarget = &(*poTarget)["source_crs"];
    auto itCs = poTarget->find("coordinate_system");
    if (itCs == poTarget->end()) return false;
    auto itAxes = itCs->find("axis");
    if (itAxes == itCs->end() || !itAxes->is_array() || itAxes->size() != 3) return false;
    nlohmann::json oJsonUnit = {{"type", "LinearUnit"},
                                {"name", oUnit.GetName()},
                                {"conversion_factor", oUnit.GetMetresPerUnit()}};
    if (const char* pszCode = UnitCode(oUnit))
        oJsonUnit["id"] = {{"authority", "EPSG"}, {"code", std::stoi(pszCode)}};
    (*itAxes)[2]["unit"] = oJsonUnit;
    return true;
}

// Horizontal system with ellipsoidal heights: the same system made 3-D.
PJPtr MakeEllipsoidal(PJ_CONTEXT* poCtx, const PJ* poHorizontal, const cs::LinearUnit& oUnit) {
    PJPtr poCrs(proj_crs_promote_to_3D(poCtx, nullptr, poHorizontal));
    if (!poCrs || IsMetre(oUnit)) return poCrs;
    const char* pszJson = proj_as_projjson(poCtx, poCrs.get(), nullptr);
    if (pszJson == nullptr) return nullptr;
    nlohmann::json oCrs = nlohmann::json::parse(pszJson, nullptr, false);
    if (oCrs.is_discarded() || !SetHeightUnit(oCrs, oUnit)) return nullptr;
    const std::string osJson = oCrs.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace);
    return PJPtr(proj_create(poCtx, osJson.c_str()));
}

// "EPSG:4326" -> ("EPSG", "4326"); "4326" -> ("EPSG", "4326"). False when
// the text has no such form.
bool SplitAuthorityCode(const std::string& osText, std::string& osAuthority, std::string& osCode) {
    const std::size_t nColon = osText.find(':');
    if (nColon == std::string::npos) {
        osAuthority = "EPSG";
        osCode = osText;
    } else {
        osAuthority = osText.substr(0, nColon);
        osCode = osText.substr(nColon + 1);
    }
    if (osAuthority.empty() || osCode.empty()) return false;
    for (char c : osAuthority + osCode) {
        if (std::isalnum(static_cast<unsigned char>(c)) == 0 && c != '_' && c != '-') return false;
    }
    return nColon != std::string::npos ||
           osCode.find_first_not_of("0123456789") == std::string::npos;
}

class ProjInfoFactory final : public IProjInfoFactory {
  public:
    cs::ICRS* CreateCRS(const ProjInfo_t& sInfo) const override {
        return utils::ProjInfoToCRS(sInfo);
    }
};

class CSAuthorityFactory final : public ICSAuthorityFactory {
  public:
    cs::ICRS* CreateCRS(const std::string& osCode) const override {
        std::string osAuthority;
        std::string osNumber;
        if (!SplitAuthorityCode(osCode, osAuthority, osNumber)) {
            ThrowParameter("osCode", "Malformed coordinate reference system code " + Quoted(osCode),
                           __PRETTY_FUNCTION__, __LINE__);
        }
        PJ_CONTEXT* poCtx = detail::ThreadProjContext();
        PJPtr poCrs(proj_create_from_database(poCtx, osAuthority.c_str(), osNumber.c_str(),
                                              PJ_CATEGORY_CRS, 0, nullptr));
        if (!poCrs) {
            ThrowParameter("osCode", "Unknown coordinate reference system code " + Quoted(osCode),
                           __PRETTY_FUNCTION__, __LINE__);
        }
        return MakeCRS(poCtx, poCrs.get(), false);
    }

    cs::ICRS* CreateWGS84Ellipsoidal() const override {
        return CreateCRS(std::string("EPSG:") + kWGS84EllipsoidalCode);
    }
};

}  // namespace

// ---------------------------------------------------------------------------

namespace cs {

LinearUnit::LinearUnit(std::string osName, double dfMetresPerUnit)
    : mosName(std::move(osName)), mdfMetresPerUnit(dfMetresPerUnit) {
    if (mosName.empty()) {
        ThrowParameter("osName", "A linear unit needs a name", __PRETTY_FUNCTION__, __LINE__);
    }
    if (!std::isfinite(dfMetresPerUnit) || dfMetresPerUnit <= 0.0) {
        ThrowParameter("dfMetresPerUnit",
                       FormatString("Invalid length of linear unit '%s': %g metres",
                                    mosName.c_str(), dfMetresPerUnit),
                       __PRETTY_FUNCTION__, __LINE__);
    }
}

LinearUnit LinearUnit::Metre() {
    return LinearUnit("metre", 1.0);
}
LinearUnit LinearUnit::Foot() {
    return LinearUnit("foot", 0.3048);
}
LinearUnit LinearUnit::USSurveyFoot() {
    return LinearUnit("US survey foot", 1200.0 / 3937.0);
}

}  // namespace cs

const IProjInfoFactory* ProjectionEngine::GetProjInfoFactory(int nType) {
    static const ProjInfoFactory oFactory;
    return nType == kProjectionEngineProj ? &oFactory : nullptr;
}

const ICSAuthorityFactory* ProjectionEngine::GetCSAuthorityFactory(int nType) {
    static const CSAuthorityFactory oFactory;
    return nType == kProjectionEngineProj ? &oFactory : nullptr;
}

namespace utils {

cs::ICRS* ProjInfoToCRS(const ProjInfo_t& sInfo) {
    const std::string osDefinition = detail::ProjInfoToProjDefinition(sInfo);
    if (osDefinition.empty()) return nullptr;
    PJ_CONTEXT* poCtx = detail::ThreadProjContext();
    PJPtr poCrs(proj_create(poCtx, osDefinition.c_str()));
    if (!poCrs || proj_is_crs(poCrs.get()) == 0) return nullptr;
    // Systems given by parameters alone are named after their description.
    if (TextOrEmpty(proj_get_name(poCrs.get())) == "unknown") {
        const std::string osText(sInfo.szProj, strnlen(sInfo.szProj, sizeof(sInfo.szProj)));
        PJPtr poNamed(proj_alter_name(poCtx, poCrs.get(), osText.c_str()));
        if (poNamed) poCrs = std::move(poNamed);
    }
    return MakeCRS(poCtx, poCrs.get(), false);
}

cs::ICRS* CreateCRSFromDefinition(const std::string& osDefinition) {
    PJ_CONTEXT* poCtx = detail::ThreadProjContext();
    PJPtr poCrs(osDefinition.empty() ? nullptr : proj_create(poCtx, osDefinition.c_str()));
    if (!poCrs || proj_is_crs(poCrs.get()) == 0) {
        ThrowParameter("osDefinition",
                       "Not a coordinate reference system definition: " + Quoted(osDefinition),
                       __PRETTY_FUNCTION__, __LINE__);
    }
    return MakeCRS(poCtx, poCrs.get(), false);
}

cs::ICRS* CreateCompoundCS(const cs::ICRS* poHorizontal, DatumType eVertical) {
    return CreateCompoundCS(poHorizontal, eVertical, cs::LinearUnit::Metre());
}

cs::ICRS* CreateCompoundCS(const cs::ICRS* poHorizontal, DatumType eVertical,
                           const cs::LinearUnit& oHeightUnit) {
    if (poHorizontal == nullptr) {
        ThrowParameter("poHorizontal", "No horizontal coordinate reference system given",
                       __PRETTY_FUNCTION__, __LINE__);
    }
    if (eVertical != cs::CS_VD_Orthometric && eVertical != cs::CS_VD_Ellipsoidal) {
        ThrowParameter(
            "eVertical",
            FormatString("Unsupported vertical datum type %d", static_cast<int>(eVertical)),
            __PRETTY_FUNCTION__, __LINE__);
    }
    PJ_CONTEXT* poCtx = detail::ThreadProjContext();
    PJPtr poSource(proj_create(poCtx, poHorizontal->GetDefinition().c_str()));
    PJPtr poHorizontal2D = poSource ? HorizontalPart(poCtx, poSource.get()) : nullptr;
    if (!poHorizontal2D) {
        ThrowParameter(
            "poHorizontal",
            "Not a horizontal coordinate reference system: " + Quoted(poHorizontal->GetName()),
            __PRETTY_FUNCTION__, __LINE__);
    }
    PJPtr poCompound = eVertical == cs::CS_VD_Orthometric
                           ? MakeOrthometric(poCtx, poHorizontal2D.get(), oHeightUnit)
                           : MakeEllipsoidal(poCtx, poHorizontal2D.get(), oHeightUnit);
    if (!poCompound) {
        throw DataException("Could not build a compound coordinate reference system from " +
                                Quoted(poHorizontal->GetName()),
                            kSourceFile, __PRETTY_FUNCTION__, __LINE__);
    }
    return MakeCRS(poCtx, poCompound.get(), true);
}

}  // namespace utils
}  // namespace ogc
}  // namespace nova
