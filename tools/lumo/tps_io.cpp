#include "tps_io.h"

#include <string>

#include "cli_error.h"
#include "json_fields.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

// Largest number of control points a file may declare: far above any
// spline that can be fitted (the fit is cubic in the count), low enough
// that a corrupt count cannot ask for absurd amounts of memory.
constexpr int kMaxControlPoints = 1000000;

// Names of the two direction sections and the containers they fill.
constexpr const char* kGeoToImage = "geoToImage";
constexpr const char* kImageToGeo = "imageToGeo";

TPSInfo_t& SplineOf(const TRNInfo_t* psTrn, const char* pszDirection) {
    if (psTrn == nullptr || psTrn->nType != TRN_TPS || psTrn->pModel == nullptr) {
        LUMO_CLI_FAIL(std::string("cannot write model: direction ") + Quoted(pszDirection) +
                      " holds no spline");
    }
    return *static_cast<TPSInfo_t*>(psTrn->pModel);
}

// One direction: the spline's control points, coefficients and fit record.
// Only the first nCPs points carry radial weights; fewer than 4 points give
// an affine spline with nCPs = 0.
void ReadDirection(const json& document, const char* pszDirection, const FieldContext& parent,
                   TRNInfo_t* psTrn) {
    const json& section = RequireObjectField(document, pszDirection, parent);
    const FieldContext where = parent.Child(pszDirection);
    TPSInfo_t& spline = *static_cast<TPSInfo_t*>(psTrn->pModel);
    const int nCPs = GetInt(section, "nCPs", 0, kMaxControlPoints, where);
    if (nCPs > 0 && nCPs < 4) {
        where.Fail("nCPs",
                   "must be 0 (an affine spline) or at least 4, found " + std::to_string(nCPs));
    }
    // Room for the affine part even without radial terms.
    spline.SetNumCPs(nCPs > 0 ? nCPs : 1);
    spline.nCPs = nCPs;
    const auto count = static_cast<std::size_t>(nCPs);
    GetFiniteArray(section, "cpX", count, spline.padfCPX, where);
    GetFiniteArray(section, "cpY", count, spline.padfCPY, where);
    GetFiniteArray(section, "coefX", count + 3, spline.padfCoefX, where);
    GetFiniteArray(section, "coefY", count + 3, spline.padfCoefY, where);
    GetFiniteArray(section, "affine", 6, spline.adfAffine, where);
    spline.nRank = GetInt(section, "rank", 0, kMaxControlPoints + 3, where);
    spline.dfCondition = GetFiniteNumber(section, "condition", where);
    psTrn->bCalculated = GetBool(section, "calculated", where) ? 1 : 0;
}

json WriteDirection(const TRNInfo_t* psTrn, const char* pszDirection) {
    const TPSInfo_t& spline = SplineOf(psTrn, pszDirection);
    const std::string prefix = std::string("tps.") + pszDirection + ".";
    json section = json::object();
    section["calculated"] = psTrn->bCalculated != 0;
    section["nCPs"] = spline.nCPs;
    section["cpX"] = FiniteNumberArray(spline.padfCPX, spline.nCPs, ItemOf("item", prefix + "cpX"));
    section["cpY"] = FiniteNumberArray(spline.padfCPY, spline.nCPs, ItemOf("item", prefix + "cpY"));
    section["coefX"] =
        FiniteNumberArray(spline.padfCoefX, spline.nCPs + 3, ItemOf("item", prefix + "coefX"));
    section["coefY"] =
        FiniteNumberArray(spline.padfCoefY, spline.nCPs + 3, ItemOf("item", prefix + "coefY"));
    section["affine"] = FiniteNumberArray(spline.adfAffine, 6, ItemOf("item", prefix + "affine"));
    section["rank"] = spline.nRank;
    section["condition"] = FiniteForWrite(spline.dfCondition, prefix + "condition");
    return section;
}

}  // namespace

TpsPtr TpsFromJson(const ModelEnvelope& envelope, const json& section) {
    TpsPtr tps(TPSAllocate(nullptr));
    // The record keeps the text in a fixed buffer; a longer one would be cut.
    CopyText(envelope.osGeosys, tps->pszGeosys, TPS_GEOSYS_SIZE, "geosys",
             FieldContext{envelope.osSource, ""});
    const FieldContext where{envelope.osSource, "tps"};
    tps->nPixels = envelope.nPixels;
    tps->nLines = envelope.nLines;
    ReadDirection(section, kGeoToImage, where, tps->psGeoToImage);
    ReadDirection(section, kImageToGeo, where, tps->psImageToGeo);
    EnvelopeToProjInfo(envelope, tps->psProjInfo);
    RequireValidRecord(envelope, "tps", TPSValidate(tps.get()));
    return tps;
}

std::shared_ptr<void> ReadTpsRecord(const ModelEnvelope& envelope, const json& section) {
    return ShareTpsRecord(TpsFromJson(envelope, section));
}

std::shared_ptr<void> ShareTpsRecord(TpsPtr tps) {
    // shared_ptr releases the record itself should its own allocation fail.
    return std::shared_ptr<void>(tps.release(),
                                 [](void* p) { TPSDeallocate(static_cast<TPSMInfo_t*>(p)); });
}

json TpsToJson(const TPSMInfo_t& tps) {
    const std::string geosys = BufferText(tps.pszGeosys, TPS_GEOSYS_SIZE - 1);
    json document = MakeEnvelope("tps", geosys.c_str(), tps.psProjInfo, tps.nPixels, tps.nLines);
    json section = json::object();
    section[kGeoToImage] = WriteDirection(tps.psGeoToImage, kGeoToImage);
    section[kImageToGeo] = WriteDirection(tps.psImageToGeo, kImageToGeo);
    document["tps"] = std::move(section);
    return document;
}

}  // namespace lumo::cli
