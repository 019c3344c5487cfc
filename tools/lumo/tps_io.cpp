#include "tps_io.h"

#include <cmath>
#include <cstring>
#include <limits>
#include <string>

#include "cli_error.h"

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

// The file and the path of the object being read, for messages.
struct Where {
    const std::string& osSource;
    std::string osPath;

    [[noreturn]] void Fail(const char* name, const std::string& problem) const {
        LUMO_CLI_FAIL(osSource + ": field " + Quoted(osPath + "." + name) + " " + problem);
    }
};

const json& Require(const json& object, const char* name, const Where& where) {
    const auto it = object.find(name);
    if (it == object.end()) where.Fail(name, "is missing");
    return *it;
}

int ReadInt(const json& object, const char* name, int minimum, int maximum, const Where& where) {
    const json& value = Require(object, name, where);
    if (!value.is_number_integer()) where.Fail(name, "must be an integer, found " + value.dump());
    const bool fitsSigned = !value.is_number_unsigned() ||
                            value.get<std::uint64_t>() <= std::numeric_limits<std::int64_t>::max();
    const std::int64_t n = fitsSigned ? value.get<std::int64_t>() : maximum + std::int64_t{1};
    if (n < minimum || n > maximum) {
        where.Fail(name, "must lie in " + std::to_string(minimum) + ".." + std::to_string(maximum) +
                             ", found " + value.dump());
    }
    return static_cast<int>(n);
}

double ReadNumber(const json& object, const char* name, const Where& where) {
    const json& value = Require(object, name, where);
    const double number = value.is_number() ? value.get<double>() : std::nan("");
    if (!std::isfinite(number)) where.Fail(name, "must be a finite number, found " + value.dump());
    return number;
}

void ReadNumbers(const json& object, const char* name, int count, double* target,
                 const Where& where) {
    const json& value = Require(object, name, where);
    if (!value.is_array()) where.Fail(name, "must be an array of numbers, found " + value.dump());
    if (value.size() != static_cast<std::size_t>(count)) {
        where.Fail(name, "must hold " + std::to_string(count) + " numbers, found " +
                             std::to_string(value.size()));
    }
    for (int k = 0; k < count; ++k) {
        const json& item = value[static_cast<std::size_t>(k)];
        const double number = item.is_number() ? item.get<double>() : std::nan("");
        if (!std::isfinite(number)) {
            where.Fail(name, "item " + std::to_string(k) + " must be a finite number, found " +
                                 item.dump());
        }
        target[k] = number;
    }
}

json NumberArray(const double* values, int count, const std::string& name) {
    json array = json::array();
    for (int k = 0; k < count; ++k) {
        if (!std::isfinite(values[k])) {
            LUMO_CLI_FAIL("cannot write model: item " + std::to_string(k) + " of " + Quoted(name) +
                          " is not finite");
        }
        array.push_back(values[k]);
    }
    return array;
}

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
void ReadDirection(const json& document, const char* pszDirection, const Where& parent,
                   TRNInfo_t* psTrn) {
    const json& section = Require(document, pszDirection, parent);
    const Where where{parent.osSource, parent.osPath + "." + pszDirection};
    if (!section.is_object()) parent.Fail(pszDirection, "must be a JSON object");
    TPSInfo_t& spline = *static_cast<TPSInfo_t*>(psTrn->pModel);
    const int nCPs = ReadInt(section, "nCPs", 0, kMaxControlPoints, where);
    if (nCPs > 0 && nCPs < 4) {
        where.Fail("nCPs",
                   "must be 0 (an affine spline) or at least 4, found " + std::to_string(nCPs));
    }
    // Room for the affine part even without radial terms.
    spline.SetNumCPs(nCPs > 0 ? nCPs : 1);
    spline.nCPs = nCPs;
    ReadNumbers(section, "cpX", nCPs, spline.padfCPX, where);
    ReadNumbers(section, "cpY", nCPs, spline.padfCPY, where);
    ReadNumbers(section, "coefX", nCPs + 3, spline.padfCoefX, where);
    ReadNumbers(section, "coefY", nCPs + 3, spline.padfCoefY, where);
    ReadNumbers(section, "affine", 6, spline.adfAffine, where);
    spline.nRank = ReadInt(section, "rank", 0, kMaxControlPoints + 3, where);
    spline.dfCondition = ReadNumber(section, "condition", where);
    const json& calculated = Require(section, "calculated", where);
    if (!calculated.is_boolean()) {
        where.Fail("calculated", "must be true or false, found " + calculated.dump());
    }
    psTrn->bCalculated = calculated.get<bool>() ? 1 : 0;
}

json WriteDirection(const TRNInfo_t* psTrn, const char* pszDirection) {
    const TPSInfo_t& spline = SplineOf(psTrn, pszDirection);
    const std::string prefix = std::string("tps.") + pszDirection + ".";
    json section = json::object();
    section["calculated"] = psTrn->bCalculated != 0;
    section["nCPs"] = spline.nCPs;
    section["cpX"] = NumberArray(spline.padfCPX, spline.nCPs, prefix + "cpX");
    section["cpY"] = NumberArray(spline.padfCPY, spline.nCPs, prefix + "cpY");
    section["coefX"] = NumberArray(spline.padfCoefX, spline.nCPs + 3, prefix + "coefX");
    section["coefY"] = NumberArray(spline.padfCoefY, spline.nCPs + 3, prefix + "coefY");
    section["affine"] = NumberArray(spline.adfAffine, 6, prefix + "affine");
    section["rank"] = spline.nRank;
    if (!std::isfinite(spline.dfCondition)) {
        LUMO_CLI_FAIL("cannot write model: " + Quoted(prefix + "condition") + " is not finite");
    }
    section["condition"] = spline.dfCondition;
    return section;
}

}  // namespace

TpsPtr TpsFromJson(const ModelEnvelope& envelope, const json& section) {
    // The record keeps the text in a fixed buffer; a longer one would be cut.
    if (envelope.osGeosys.size() >= static_cast<std::size_t>(TPS_GEOSYS_SIZE)) {
        LUMO_CLI_FAIL(envelope.osSource + ": field \"geosys\": " + Quoted(envelope.osGeosys) +
                      " is longer than " + std::to_string(TPS_GEOSYS_SIZE - 1) + " characters");
    }
    const Where where{envelope.osSource, "tps"};
    TpsPtr tps(TPSAllocate(nullptr));
    tps->nPixels = envelope.nPixels;
    tps->nLines = envelope.nLines;
    ReadDirection(section, kGeoToImage, where, tps->psGeoToImage);
    ReadDirection(section, kImageToGeo, where, tps->psImageToGeo);
    std::memcpy(tps->pszGeosys, envelope.osGeosys.c_str(), envelope.osGeosys.size() + 1);
    EnvelopeToProjInfo(envelope, tps->psProjInfo);
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
    // The buffer need not be terminated within its size; never read past it.
    const std::string geosys(tps.pszGeosys, strnlen(tps.pszGeosys, TPS_GEOSYS_SIZE - 1));
    json document = MakeEnvelope("tps", geosys.c_str(), tps.psProjInfo, tps.nPixels, tps.nLines);
    json section = json::object();
    section[kGeoToImage] = WriteDirection(tps.psGeoToImage, kGeoToImage);
    section[kImageToGeo] = WriteDirection(tps.psImageToGeo, kImageToGeo);
    document["tps"] = std::move(section);
    return document;
}

}  // namespace lumo::cli
