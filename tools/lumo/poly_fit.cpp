#include "poly_fit.h"

#include <string>

#include "json_fields.h"
#include "model_io.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

// Terms of the complete polynomial of an order: 3, 6, 10, 15, 21.
int TermsOf(int order) {
    return (order + 1) * (order + 2) / 2;
}

json Pair(double a, double b, const std::string& name) {
    return json::array({FiniteForWrite(a, name), FiniteForWrite(b, name)});
}

json DirectionToJson(const GEOInfo_t& g, const std::string& name) {
    json out = json::object();
    out["order"] = g.nOrder;
    out["inOffset"] = Pair(g.dfInXOffset, g.dfInYOffset, name + ".inOffset");
    out["inScale"] = Pair(g.dfInXScale, g.dfInYScale, name + ".inScale");
    out["outOffset"] = Pair(g.dfOutXOffset, g.dfOutYOffset, name + ".outOffset");
    out["outScale"] = Pair(g.dfOutXScale, g.dfOutYScale, name + ".outScale");
    out["xCoeffs"] =
        FiniteNumberArray(g.adfNormXCoeffs, g.nTerms, ItemOf("item", name + ".xCoeffs"));
    out["yCoeffs"] =
        FiniteNumberArray(g.adfNormYCoeffs, g.nTerms, ItemOf("item", name + ".yCoeffs"));
    return out;
}

// Two numbers of a field; scales must be positive.
void ReadPair(const json& object, const char* name, bool scale, double* a, double* b,
              const FieldContext& ctx) {
    const ArrayFormat pair{ArrayWording::kLengthAndSize, ItemWording::kItemWord, ""};
    double values[2];
    GetFiniteArray(object, name, 2, values, ctx, pair);
    if (scale && !(values[0] > 0.0 && values[1] > 0.0)) {
        ctx.Fail(name, "must hold two positive numbers");
    }
    *a = values[0];
    *b = values[1];
}

GEOInfo_t DirectionFromJson(const json& object, const FieldContext& ctx) {
    GEOInfo_t g{};
    g.nOrder = GetInt(object, "order", 1, GCP_MAX_ORDER, ctx);
    g.nTerms = TermsOf(g.nOrder);
    g.nFitKind = GCP_FIT_POLYNOMIAL;
    ReadPair(object, "inOffset", false, &g.dfInXOffset, &g.dfInYOffset, ctx);
    ReadPair(object, "inScale", true, &g.dfInXScale, &g.dfInYScale, ctx);
    ReadPair(object, "outOffset", false, &g.dfOutXOffset, &g.dfOutYOffset, ctx);
    ReadPair(object, "outScale", true, &g.dfOutXScale, &g.dfOutYScale, ctx);
    const ArrayFormat terms{ArrayWording::kTypeThenLength, ItemWording::kItemWord, " (order)"};
    GetFiniteArray(object, "xCoeffs", g.nTerms, g.adfNormXCoeffs, ctx, terms);
    GetFiniteArray(object, "yCoeffs", g.nTerms, g.adfNormYCoeffs, ctx, terms);
    return g;
}

}  // namespace

json PolyFitToJson(const PolyFit& fit) {
    return json{{"geoToImage", DirectionToJson(fit.sGeoToImage, "fit.geoToImage")},
                {"imageToGeo", DirectionToJson(fit.sImageToGeo, "fit.imageToGeo")}};
}

std::shared_ptr<const PolyFit> PolyFitFromJson(const ModelEnvelope& envelope, const json& section) {
    if (FindField(section, "fit") == nullptr) return nullptr;
    const FieldContext poly{envelope.osSource, "poly"};
    const json& object = RequireObjectField(section, "fit", poly);
    const FieldContext ctx = poly.Child("fit");
    auto fit = std::make_shared<PolyFit>();
    fit->sGeoToImage =
        DirectionFromJson(RequireObjectField(object, "geoToImage", ctx), ctx.Child("geoToImage"));
    fit->sImageToGeo =
        DirectionFromJson(RequireObjectField(object, "imageToGeo", ctx), ctx.Child("imageToGeo"));
    return fit;
}

}  // namespace lumo::cli
