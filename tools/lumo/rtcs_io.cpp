#include "rtcs_io.h"

#include <string>
#include <vector>

#include "cli_error.h"
#include "geosys_option.h"
#include "json_fields.h"
#include "nova/projection.h"
#include "nova/runtime.h"
#include "segment_io.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

constexpr const char* kGroundGeosys = "LONG/LAT D000";

std::vector<ControlPoint_t> ReadGcps(const json& section, const FieldContext& ctx) {
    const json& points = RequireField(section, "gcps", ctx);
    if (!points.is_array()) ctx.Fail("gcps", "must be an array of [pixel, line, x, y, z]");
    std::vector<ControlPoint_t> ao;
    for (std::size_t i = 0; i < points.size(); ++i) {
        double v[5];
        ReadFiniteArray(points[i], ("gcps[" + std::to_string(i) + "]").c_str(), 5, v, ctx,
                        ArrayFormat{ArrayWording::kLengthAndValue, ItemWording::kItemWord, ""});
        ao.push_back({v[0], v[1], v[2], v[3], v[4]});
    }
    return ao;
}

}  // namespace

RtcsPtr GenerateRtcs(const EphemerisSeg_t& segment, const ProjInfo_t& sProj,
                     const std::string& osHeightRef, const std::vector<ControlPoint_t>& aoGcps,
                     const std::string& osSource) {
    try {
        return RtcsPtr(RTCSGenModel(&segment, sProj, osHeightRef, aoGcps));
    } catch (const nova::Exception& e) {
        LUMO_CLI_FAIL(osSource + ": no radar model: " + e.GetMessage());
    }
}

RtcsPtr RtcsFromJson(const ModelEnvelope& envelope, const json& section) {
    if (!section.is_object()) LUMO_CLI_FAIL(envelope.osSource + ": \"rtcs\" must be an object");
    const FieldContext ctx{envelope.osSource, "rtcs"};
    const std::string osHeightRef = GetText(section, "heightRef", ctx);
    if (osHeightRef != "E" && osHeightRef != "M") {
        ctx.Fail("heightRef", "must be \"E\" or \"M\", found " + Quoted(osHeightRef));
    }
    const std::string osGeosys = GetText(section, "gcpGeosys", ctx);
    ProjInfo_t sProj =
        UserGeosys(osGeosys, envelope.osSource + ": field " + Quoted(ctx.Field("gcpGeosys")));
    if (const json* parms = FindField(section, "gcpProjParms"); parms != nullptr) {
        const std::string osParms = TextValue(*parms, "gcpProjParms", ctx);
        if (ProjParms2Info(osParms.c_str(), &sProj) != 0) {
            ctx.Fail("gcpProjParms", "cannot apply " + Quoted(osParms));
        }
    }
    const int nDownsample = GetInt(section, "downsample", 1, 1 << 20, ctx);
    const std::vector<ControlPoint_t> aoGcps = ReadGcps(section, ctx);
    const json& segment = RequireField(section, "segment", ctx);
    SegmentPtr psSegment = SegmentFromJson(nlohmann::ordered_json::parse(segment.dump()),
                                           envelope.osSource + " (rtcs.segment)");
    if (psSegment->nNumPixels != envelope.nPixels || psSegment->nNumLines != envelope.nLines) {
        LUMO_CLI_FAIL(envelope.osSource + ": \"pixels\" and \"lines\" (" +
                      std::to_string(envelope.nPixels) + " x " + std::to_string(envelope.nLines) +
                      ") differ from the segment's image size");
    }
    RtcsPtr model = GenerateRtcs(*psSegment, sProj, osHeightRef, aoGcps, envelope.osSource);
    model->nDownsample = nDownsample;
    return model;
}

std::shared_ptr<void> ReadRtcsRecord(const ModelEnvelope& envelope, const json& section) {
    RtcsPtr model = RtcsFromJson(envelope, section);
    return std::shared_ptr<void>(model.release(),
                                 [](void* p) { RTCSFreeModel(static_cast<RTCSInfo_t*>(p)); });
}

json RtcsToJson(const RTCSInfo_t& model) {
    if (model.psEphemeris == nullptr || model.psCOpt == nullptr) {
        LUMO_CLI_FAIL("cannot write model: the radar record has no segment");
    }
    const EphemerisSeg_t& segment = *model.psEphemeris;
    json document =
        MakeEnvelope("rtcs", kGroundGeosys, nullptr, segment.nNumPixels, segment.nNumLines);
    json section = json::object();
    section["heightRef"] = model.osHeightRef;
    section["gcpGeosys"] = model.sGcpProj.szProj;
    if (RequiresProjInfo(DecodeGeosys(model.sGcpProj.szProj, nullptr))) {
        std::unique_ptr<char, nova::FreeDeleter> parms(ProjInfo2Parms(&model.sGcpProj));
        if (parms) section["gcpProjParms"] = parms.get();
    }
    section["downsample"] = model.nDownsample;
    json gcps = json::array();
    for (std::size_t i = 0; i < model.vecGcps.size(); ++i) {
        const ControlPoint_t& p = model.vecGcps[i];
        const double v[5] = {p.dfImageX, p.dfImageY, p.dfGroundX, p.dfGroundY, p.dfGroundZ};
        gcps.push_back(
            FiniteNumberArray(v, 5, ItemLabel{"value ", " of gcps[" + std::to_string(i) + "]"}));
    }
    section["gcps"] = std::move(gcps);
    section["segment"] = json::parse(SegmentToJson(segment).dump());
    document["rtcs"] = std::move(section);
    return document;
}

}  // namespace lumo::cli
