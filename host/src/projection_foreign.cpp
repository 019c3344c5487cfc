// Coordinate reference systems that PROJ defines: EPSG codes ("EPSG:32631")
// and PROJ strings, WKT or PROJJSON. An EPSG code is kept as the text and
// PROJ's database defines the system; a definition is identified with its
// EPSG code, or else translated into our own grammar with its parameters.
// Either way a description is built from a short text, so records with
// 16-character projection buffers and parameter texts carry it unchanged.

#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <list>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "proj_definition.h"
#include "projection.h"

namespace nova {
namespace detail {
namespace {

constexpr double kDegree = 0.017453292519943295;  // radians

std::string TextOf(const char* pszText) {
    return pszText != nullptr ? std::string(pszText) : std::string();
}

// The EPSG code of an object, or 0.
int EpsgCodeOf(const PJ* poObject) {
    if (TextOf(proj_get_id_auth_name(poObject, 0)) != "EPSG") return 0;
    return std::atoi(TextOf(proj_get_id_code(poObject, 0)).c_str());
}

// The EPSG datum codes of our datum table, looked up once per thread.
const std::vector<int>& TableDatumCodes() {
    thread_local std::vector<int> anCodes;
    if (!anCodes.empty()) return anCodes;
    PJ_CONTEXT* poCtx = ThreadProjContext();
    for (int i = 0; i < DatumCount(); ++i) {
        PJPtr poCrs(proj_create_from_database(poCtx, "EPSG",
                                              std::to_string(FindDatum(i)->nEpsgGeographic).c_str(),
                                              PJ_CATEGORY_CRS, 0, nullptr));
        PJPtr poDatum(poCrs ? proj_crs_get_datum_forced(poCtx, poCrs.get()) : nullptr);
        anCodes.push_back(poDatum ? EpsgCodeOf(poDatum.get()) : -1);
    }
    return anCodes;
}

// Value of a conversion parameter by its EPSG code, in degrees for angles
// and metres (or unity) otherwise; false when the conversion has none.
bool Parameter(PJ_CONTEXT* poCtx, const PJ* poConv, int nCode, double* pdfValue) {
    const int nCount = proj_coordoperation_get_param_count(poCtx, poConv);
    for (int i = 0; i < nCount; ++i) {
        const char* pszCode = nullptr;
        const char* pszCategory = nullptr;
        double dfValue = 0.0;
        double dfToSI = 1.0;
        proj_coordoperation_get_param(poCtx, poConv, i, nullptr, nullptr, &pszCode, &dfValue,
                                      nullptr, &dfToSI, nullptr, nullptr, nullptr, &pszCategory);
        if (std::atoi(TextOf(pszCode).c_str()) != nCode) continue;
        const bool bAngle = TextOf(pszCategory) == "angular";
        *pdfValue = bAngle ? dfValue * dfToSI / kDegree : dfValue * dfToSI;
        return std::isfinite(*pdfValue);
    }
    return false;
}

// EPSG parameter codes.
enum ParmCode {
    kLatOrigin = 8801,
    kLonOrigin = 8802,
    kScale = 8805,
    kFalseEasting = 8806,
    kFalseNorthing = 8807,
    kLatFalseOrigin = 8821,
    kLonFalseOrigin = 8822,
    kLatParallel1 = 8823,
    kLatParallel2 = 8824,
    kEastingFalseOrigin = 8826,
    kNorthingFalseOrigin = 8827,
    kLatStdParallel = 8832,
    kLonOfOrigin = 8833,
};

// Methods we describe by keyword and parameters, and conformal ones we can
// only name by code.
enum MethodCode {
    kTransverseMercator = 9807,
    kLcc1SP = 9801,
    kLcc2SP = 9802,
    kPolarStereoA = 9810,
    kPolarStereoB = 9829,
    kMercatorA = 9804,
    kMercatorB = 9805,
};
constexpr int kOtherConformal[] = {9803, 9808, 9809, 9812, 9815, 9830, 1102};

struct Parms {
    PJ_CONTEXT* poCtx;
    const PJ* poConv;
    double* p;
    bool Get(int nCode, double* pdf) const { return Parameter(poCtx, poConv, nCode, pdf); }
    bool Angle(int nCode, int nIndex) const {
        double dfValue = 0.0;
        if (!Get(nCode, &dfValue)) return false;
        p[nIndex] = DegreesToPackedDMS(dfValue);
        return true;
    }
    bool Plain(int nCode, int nIndex) const { return Get(nCode, &p[nIndex]); }
};

// The GCTP kind and parameters of a map projection; OTHER for projections
// that have no keyword of ours (or parameter values our keywords cannot
// hold), with their conformality.
void ClassifyConversion(PJ_CONTEXT* poCtx, const PJ* poConv, ForeignSystem* psOut) {
    const char* pszMethodCode = nullptr;
    proj_coordoperation_get_method_info(poCtx, poConv, nullptr, nullptr, &pszMethodCode);
    const int nMethod = std::atoi(TextOf(pszMethodCode).c_str());
    const Parms sP{poCtx, poConv, psOut->adfParms};
    double dfScale = 1.0;
    psOut->nKind = NOVA_PROJ_OTHER;
    psOut->bConformal = false;
    for (int nCode : kOtherConformal) psOut->bConformal = psOut->bConformal || nCode == nMethod;
    switch (nMethod) {
        case kTransverseMercator: {
            psOut->bConformal = true;
            int nZone = 0;
            char cHemisphere = '\0';
            const std::string osName = TextOf(proj_get_name(poConv));
            if (std::sscanf(osName.c_str(), "UTM zone %d%c", &nZone, &cHemisphere) == 2 &&
                nZone >= 1 && nZone <= 60 && (cHemisphere == 'N' || cHemisphere == 'S')) {
                psOut->nKind = NOVA_PROJ_UTM;
                psOut->nZone = cHemisphere == 'N' ? nZone : -nZone;
                return;
            }
            if (sP.Plain(kScale, 2) && sP.Angle(kLonOrigin, 4) && sP.Angle(kLatOrigin, 5) &&
                sP.Plain(kFalseEasting, 6) && sP.Plain(kFalseNorthing, 7)) {
                psOut->nKind = NOVA_PROJ_TM;
            }
            break;
        }
        case kLcc1SP:
            // One standard parallel with unit scale is the two-parallel form
            // with both parallels on the origin.
            psOut->bConformal = true;
            if (sP.Get(kScale, &dfScale) && dfScale == 1.0 && sP.Angle(kLatOrigin, 2) &&
                sP.Angle(kLatOrigin, 3) && sP.Angle(kLonOrigin, 4) && sP.Angle(kLatOrigin, 5) &&
                sP.Plain(kFalseEasting, 6) && sP.Plain(kFalseNorthing, 7)) {
                psOut->nKind = NOVA_PROJ_LCC;
            }
            break;
        case kLcc2SP:
            psOut->bConformal = true;
            if (sP.Angle(kLatParallel1, 2) && sP.Angle(kLatParallel2, 3) &&
                sP.Angle(kLonFalseOrigin, 4) && sP.Angle(kLatFalseOrigin, 5) &&
                sP.Plain(kEastingFalseOrigin, 6) && sP.Plain(kNorthingFalseOrigin, 7)) {
                psOut->nKind = NOVA_PROJ_LCC;
            }
            break;
        case kPolarStereoA:
        case kPolarStereoB: {
            psOut->bConformal = true;
            // Variant A with unit scale has its true scale at the pole.
            const bool bA = nMethod == kPolarStereoA;
            const bool bTrueScale = bA ? sP.Get(kScale, &dfScale) && dfScale == 1.0 &&
                                             sP.Angle(kLatOrigin, 5) && sP.Angle(kLonOrigin, 4)
                                       : sP.Angle(kLatStdParallel, 5) && sP.Angle(kLonOfOrigin, 4);
            if (bTrueScale && sP.Plain(kFalseEasting, 6) && sP.Plain(kFalseNorthing, 7)) {
                psOut->nKind = NOVA_PROJ_PS;
            }
            break;
        }
        case kMercatorA:
        case kMercatorB: {
            psOut->bConformal = true;
            const bool bA = nMethod == kMercatorA;
            const bool bTrueScale =
                bA ? sP.Get(kScale, &dfScale) && dfScale == 1.0 : sP.Angle(kLatParallel1, 5);
            if (bTrueScale && sP.Angle(kLonOrigin, 4) && sP.Plain(kFalseEasting, 6) &&
                sP.Plain(kFalseNorthing, 7)) {
                psOut->nKind = NOVA_PROJ_MER;
            }
            break;
        }
        default:
            break;
    }
    if (psOut->nKind == NOVA_PROJ_OTHER) std::fill_n(psOut->adfParms, NOVA_PROJ_PARMS, 0.0);
}

// Unit of the first axis as its factor to radians or metres; 0 when unknown.
double AxisUnit(PJ_CONTEXT* poCtx, const PJ* poCrs, int* pnAxes) {
    PJPtr poCs(proj_crs_get_coordinate_system(poCtx, poCrs));
    if (!poCs) return 0.0;
    *pnAxes = proj_cs_get_axis_count(poCtx, poCs.get());
    double dfFactor = 0.0;
    proj_cs_get_axis_info(poCtx, poCs.get(), 0, nullptr, nullptr, nullptr, &dfFactor, nullptr,
                          nullptr, nullptr);
    return dfFactor;
}

// The earth model of a system: our datum when its datum is in the table,
// else the GCTP spheroid of its ellipsoid where one matches.
bool ResolveForeignModel(PJ_CONTEXT* poCtx, const PJ* poCrs, ForeignSystem* psOut) {
    PJPtr poDatum(proj_crs_get_datum_forced(poCtx, poCrs));
    PJPtr poEllipsoid(proj_get_ellipsoid(poCtx, poCrs));
    double a = 0.0, b = 0.0, dfInvF = 0.0;
    int bComputed = 0;
    if (!poDatum || !poEllipsoid ||
        !proj_ellipsoid_get_parameters(poCtx, poEllipsoid.get(), &a, &b, &bComputed, &dfInvF) ||
        !(a > 0.0) || !(b > 0.0)) {
        psOut->osProblem = "PROJ gives it no usable ellipsoid";
        return false;
    }
    EarthModel& sModel = psOut->sModel;
    sModel.dfSemiMajor = a;
    sModel.dfSemiMinor = b;
    sModel.nSpheroid = NearestSpheroid(a, b);
    const int nDatumCode = EpsgCodeOf(poDatum.get());
    const std::vector<int>& anTable = TableDatumCodes();
    for (std::size_t i = 0; i < anTable.size(); ++i) {
        if (nDatumCode == 0 || anTable[i] != nDatumCode) continue;
        sModel.nDatum = static_cast<int>(i);
        sModel.nSpheroid = FindDatum(sModel.nDatum)->nSpheroid;
        sModel.nEpsgGeographic = FindDatum(sModel.nDatum)->nEpsgGeographic;
    }
    // A PROJ string with +ellps or +a/+b has an ellipsoid and no datum.
    const std::string osDatum = TextOf(proj_get_name(poDatum.get()));
    psOut->bDatumless = nDatumCode == 0 && (osDatum.rfind("Unknown based on", 0) == 0 ||
                                            osDatum == "unknown" || osDatum.empty());
    PJPtr poMeridian(proj_get_prime_meridian(poCtx, poCrs));
    double dfMeridian = 0.0;
    if (poMeridian) {
        proj_prime_meridian_get_parameters(poCtx, poMeridian.get(), &dfMeridian, nullptr, nullptr);
    }
    if (dfMeridian != 0.0) psOut->bDatumless = false;  // never expressible in our texts
    return true;
}

// Reduces a PROJ CRS to what a description needs; refuses (osProblem) what
// our descriptions cannot use.
ForeignSystem Classify(PJ_CONTEXT* poCtx, const PJ* poCrs) {
    ForeignSystem sOut;
    sOut.osName = TextOf(proj_get_name(poCrs));
    const PJ_TYPE eType = proj_get_type(poCrs);
    int nAxes = 0;
    const double dfUnit = AxisUnit(poCtx, poCrs, &nAxes);
    if (eType == PJ_TYPE_GEOGRAPHIC_2D_CRS || eType == PJ_TYPE_GEOGRAPHIC_3D_CRS) {
        if (std::fabs(dfUnit / kDegree - 1.0) > 1e-9) {
            sOut.osProblem = "its angles are not in degrees";
            return sOut;
        }
        sOut.nKind = NOVA_PROJ_GEOGRAPHIC;
    } else if (eType == PJ_TYPE_PROJECTED_CRS) {
        if (nAxes != 2 || dfUnit != 1.0) {
            sOut.osProblem = "its coordinates are not easting and northing in metres";
            return sOut;
        }
        PJPtr poConv(proj_crs_get_coordoperation(poCtx, poCrs));
        if (!poConv) {
            sOut.osProblem = "PROJ gives it no map projection";
            return sOut;
        }
        ClassifyConversion(poCtx, poConv.get(), &sOut);
    } else {
        sOut.osProblem = "it is not a geographic or projected coordinate reference system";
        return sOut;
    }
    if (!ResolveForeignModel(poCtx, poCrs, &sOut)) sOut.nKind = NOVA_PROJ_UNKNOWN;
    return sOut;
}

// A small per-thread cache of lookups by key, most recently used first.
template <typename Key, typename Value>
class LookupCache {
  public:
    template <typename Make>
    const Value& Get(const Key& key, Make make) {
        for (auto it = maoEntries.begin(); it != maoEntries.end(); ++it) {
            if (it->first != key) continue;
            maoEntries.splice(maoEntries.begin(), maoEntries, it);
            return maoEntries.front().second;
        }
        maoEntries.emplace_front(key, make());
        if (maoEntries.size() > 16) maoEntries.pop_back();
        return maoEntries.front().second;
    }

  private:
    std::list<std::pair<Key, Value>> maoEntries;
};

ForeignSystem MakeEpsgSystem(int nCode) {
    PJ_CONTEXT* poCtx = ThreadProjContext();
    PJPtr poCrs(proj_create_from_database(poCtx, "EPSG", std::to_string(nCode).c_str(),
                                          PJ_CATEGORY_CRS, 0, nullptr));
    ForeignSystem sOut;
    if (!poCrs) {
        sOut.osProblem = "PROJ's database has no coordinate reference system with this code";
        return sOut;
    }
    return Classify(poCtx, poCrs.get());
}

// Our own text for a system that has no EPSG code: keyword, earth model and
// parameters. UTM systems become TM, whose parameters hold either
// hemisphere.
bool NativeText(const ForeignSystem& sSystem, TranslatedDefinition* psOut) {
    const EarthModel& sModel = sSystem.sModel;
    char szModel[16];
    if (sModel.nDatum >= 0) {
        std::snprintf(szModel, sizeof(szModel), "D%03d", sModel.nDatum);
    } else if (sSystem.bDatumless && sModel.nSpheroid >= 0) {
        std::snprintf(szModel, sizeof(szModel), "E%03d", sModel.nSpheroid);
    } else {
        psOut->osProblem =
            "PROJ finds no EPSG code for it and its datum is not one of ours "
            "(D000 to D011, or an ellipsoid E000 to E019 without a datum)";
        return false;
    }
    const char* pszKeyword = nullptr;
    std::copy_n(sSystem.adfParms, NOVA_PROJ_PARMS, psOut->adfParms);
    int nKind = sSystem.nKind;
    switch (sSystem.nKind) {
        case NOVA_PROJ_GEOGRAPHIC:
            pszKeyword = "LONG/LAT";
            break;
        case NOVA_PROJ_UTM: {
            const int nZone = std::abs(sSystem.nZone);
            pszKeyword = "TM";
            nKind = NOVA_PROJ_TM;
            psOut->adfParms[2] = 0.9996;
            psOut->adfParms[4] = DegreesToPackedDMS(6.0 * nZone - 183.0);
            psOut->adfParms[6] = 500000.0;
            psOut->adfParms[7] = sSystem.nZone < 0 ? 10000000.0 : 0.0;
            break;
        }
        case NOVA_PROJ_TM:
            pszKeyword = "TM";
            break;
        case NOVA_PROJ_LCC:
            pszKeyword = "LCC";
            break;
        case NOVA_PROJ_PS:
            pszKeyword = "PS";
            break;
        case NOVA_PROJ_MER:
            pszKeyword = "MER";
            break;
        default:
            psOut->osProblem =
                "PROJ finds no EPSG code for it and its projection is not one "
                "lumo describes by parameters (TM, LCC, PS, MER); give the "
                "system by its EPSG code";
            return false;
    }
    psOut->osText = std::string(pszKeyword) + " " + szModel;
    psOut->bHasParms = RequiresProjInfo(nKind) != 0;
    return true;
}

// The one EPSG system PROJ finds equivalent to a definition, or 0. A
// definition without a datum is never identified: PROJ would match it to
// some datum on the same ellipsoid.
int IdentifyEpsg(PJ_CONTEXT* poCtx, const PJ* poCrs) {
    int* panConfidence = nullptr;
    PJ_OBJ_LIST* poList = proj_identify(poCtx, poCrs, "EPSG", nullptr, &panConfidence);
    int nCode = 0;
    if (poList != nullptr) {
        const int nCount = proj_list_get_count(poList);
        const bool bUnique = nCount == 1 || (nCount > 1 && panConfidence[1] < panConfidence[0]);
        if (nCount > 0 && panConfidence[0] >= 70 && bUnique) {
            PJPtr poFound(proj_list_get(poCtx, poList, 0));
            if (poFound) nCode = EpsgCodeOf(poFound.get());
        }
        proj_list_destroy(poList);
    }
    proj_int_list_destroy(panConfidence);
    return nCode;
}

TranslatedDefinition MakeTranslation(const std::string& osDefinition) {
    TranslatedDefinition sOut;
    std::string osInput = osDefinition;
    // A PROJ string names a coordinate system only with +type=crs.
    if (osInput[0] == '+' && osInput.find("+type=crs") == std::string::npos) {
        osInput += " +type=crs";
    }
    PJ_CONTEXT* poCtx = ThreadProjContext();
    PJPtr poCrs(proj_create(poCtx, osInput.c_str()));
    if (!poCrs || !proj_is_crs(poCrs.get())) {
        sOut.osProblem = "PROJ cannot read it as a coordinate reference system";
        return sOut;
    }
    // A bound CRS (+towgs84, TOWGS84[]) carries its own datum shift, which
    // none of our texts can hold.
    if (proj_get_type(poCrs.get()) == PJ_TYPE_BOUND_CRS) {
        sOut.osProblem =
            "it carries its own datum shift (+towgs84 or TOWGS84); give the "
            "system by its EPSG code";
        return sOut;
    }
    const ForeignSystem sSystem = Classify(poCtx, poCrs.get());
    if (sSystem.nKind == NOVA_PROJ_UNKNOWN) {
        sOut.osProblem = sSystem.osProblem;
        return sOut;
    }
    const int nCode = sSystem.bDatumless ? 0 : IdentifyEpsg(poCtx, poCrs.get());
    if (nCode != 0 && LookupEpsg(nCode).nKind != NOVA_PROJ_UNKNOWN) {
        sOut.osText = "EPSG:" + std::to_string(nCode);
        return sOut;
    }
    NativeText(sSystem, &sOut);
    return sOut;
}

}  // namespace

bool IsProjDefinition(const char* pszText, std::size_t nLen) {
    std::size_t i = 0;
    while (i < nLen && std::isspace(static_cast<unsigned char>(pszText[i]))) ++i;
    if (i == nLen) return false;
    if (pszText[i] == '+' || pszText[i] == '{') return true;
    // WKT: a keyword directly followed by a bracket.
    std::size_t j = i;
    while (j < nLen && (std::isalnum(static_cast<unsigned char>(pszText[j])) || pszText[j] == '_'))
        ++j;
    return j > i && j < nLen && (pszText[j] == '[' || pszText[j] == '(');
}

const ForeignSystem& LookupEpsg(int nCode) {
    thread_local LookupCache<int, ForeignSystem> oCache;
    return oCache.Get(nCode, [nCode] { return MakeEpsgSystem(nCode); });
}

const TranslatedDefinition& TranslateDefinition(const std::string& osDefinition) {
    thread_local LookupCache<std::string, TranslatedDefinition> oCache;
    return oCache.Get(osDefinition, [&osDefinition] { return MakeTranslation(osDefinition); });
}

}  // namespace detail
}  // namespace nova
