#include "lrs_io.h"

#include <cmath>
#include <cstdio>
#include <ostream>
#include <string>
#include <vector>

#include "cli_error.h"
#include "commands.h"
#include "geosys_option.h"
#include "json_fields.h"
#include "point_prep.h"
#include "progress.h"
#include "segment_io.h"

namespace lumo::cli {
namespace {

using nlohmann::json;

constexpr int kMaxStates = 90000;  // the library's largest state table
constexpr int kMaxScanLines = 10000000;

struct SensorField {
    const char* pszName;
    double LRSSensorModel_t::*pMember;
};
const SensorField kSensorFields[] = {
    {"refLine", &LRSSensorModel_t::dfRefLine},
    {"refPixel", &LRSSensorModel_t::dfRefPixel},
    {"scanAngle0", &LRSSensorModel_t::dfScanAngle0},
    {"scanAngleStep", &LRSSensorModel_t::dfScanAngleStep},
    {"timeOffset", &LRSSensorModel_t::dfTimeOffset},
    {"lineInterval", &LRSSensorModel_t::dfLineInterval},
    {"sampleTimeOffset", &LRSSensorModel_t::dfSampleTimeOffset},
    {"sampleInterval", &LRSSensorModel_t::dfSampleInterval},
};

// The refinement arrays: name, member, length.
struct RefinementField {
    const char* pszName;
    double* (*pfnOf)(LRSOrbitModel_t&);
    int nCount;
};
const RefinementField kRefinement[] = {
    {"orbitCorrections", [](LRSOrbitModel_t& m) { return m.adfOrbitCorr; }, 3},
    {"roll", [](LRSOrbitModel_t& m) { return m.adfRollPoly; }, 2},
    {"pitch", [](LRSOrbitModel_t& m) { return m.adfPitchPoly; }, 2},
    {"yaw", [](LRSOrbitModel_t& m) { return m.adfYawPoly; }, 2},
};

void ReadScanner(const json& section, LRSOrbitModel_t& m, const FieldContext& ctx) {
    const json& scanner = RequireObjectField(section, "scanner", ctx);
    const FieldContext sub = ctx.Child("scanner");
    LRSSensorModel_t s{};
    for (const SensorField& f : kSensorFields)
        s.*f.pMember = GetFiniteNumber(scanner, f.pszName, sub);
    s.nNumPixels = GetInt(scanner, "pixels", 2, 1 << 20, sub);
    for (int k = 0; k < 9; ++k) s.adfAlignment[k] = (k % 4 == 0) ? 1.0 : 0.0;
    m.sSensor = s;
}

void ReadControlPoints(const json& section, LRSOrbitModel_t& m, const FieldContext& ctx) {
    const json* rows = FindField(section, "controlPoints");
    if (rows == nullptr) return;
    if (!rows->is_array())
        ctx.Fail("controlPoints", "must be an array of [pixel, line, lon, lat, z]");
    for (std::size_t i = 0; i < rows->size(); ++i) {
        double v[5];
        ReadFiniteArray((*rows)[i], ("controlPoints[" + std::to_string(i) + "]").c_str(), 5, v, ctx,
                        ArrayFormat{ArrayWording::kLengthAndValue, ItemWording::kItemWord, ""});
        m.asControlPoints.push_back({v[0], v[1], v[2], v[3], v[4]});
    }
}

std::string Number(double value) {
    char text[32];
    std::snprintf(text, sizeof text, "%.4g", value);
    return text;
}

// Root-mean-square image residual (pixels) of control points under a model;
// points the model does not see count in nMissed.
double RmsResidual(const LRSOrbitModel_t& m, const std::vector<ControlPoint_t>& asPoints,
                   int& nMissed) {
    double dfSum = 0.0;
    int n = 0;
    nMissed = 0;
    for (const ControlPoint_t& c : asPoints) {
        double p = 0.0, l = 0.0;
        if (LRSGeodeticToImage(&m, c.dfGroundX, c.dfGroundY, c.dfGroundZ, &p, &l) != 1) {
            ++nMissed;
            continue;
        }
        dfSum += std::pow(p - c.dfImageX, 2) + std::pow(l - c.dfImageY, 2);
        ++n;
    }
    return n > 0 ? std::sqrt(dfSum / n) : 0.0;
}

Georef GeographicGeoref(const std::string& osGeosys, const std::string& where) {
    Georef g;
    g.osGeosys = osGeosys;
    g.sProj = UserGeosys(osGeosys, where);
    return g;
}

}  // namespace

void CheckedLrsCall(const std::string& source, const std::function<void()>& call) {
    try {
        call();
    } catch (const nova::NumberedError& e) {
        LUMO_CLI_FAIL(source + ": " + e.what());
    }
}

LrsPtr LrsFromJson(const ModelEnvelope& envelope, const json& section) {
    if (!section.is_object()) LUMO_CLI_FAIL(envelope.osSource + ": \"lrs\" must be an object");
    if (envelope.osGeosys != kLrsGeosys) {
        LUMO_CLI_FAIL(envelope.osSource +
                      ": field \"geosys\": an orbit model's ground coordinates "
                      "are " +
                      Quoted(kLrsGeosys) + ", found " + Quoted(envelope.osGeosys));
    }
    const FieldContext ctx{envelope.osSource, "lrs"};
    LrsPtr m = std::make_unique<LRSOrbitModel_t>();
    m->nEpochYear = GetInt(section, "epochYear", 1900, 2199, ctx);
    m->dfEpochSecOfYear = GetFiniteNumber(section, "epochSecondOfYear", ctx);
    m->dfTimeOrigin = GetFiniteNumber(section, "timeOrigin", ctx);
    m->dfTimeEnd = GetFiniteNumber(section, "timeEnd", ctx);
    m->dfGreenwichAngle = GetFiniteNumber(section, "greenwichAngle", ctx);
    GetFiniteArray(section, "meanElements", LRS_NUM_ELEMENTS, m->adfMeanElements, ctx);
    ReadScanner(section, *m, ctx);
    m->nNumScanLines = GetInt(section, "scanLines", 2, kMaxScanLines, ctx);
    const json& table = RequireObjectField(section, "stateTable", ctx);
    const FieldContext tableCtx = ctx.Child("stateTable");
    m->nNumStates = GetInt(table, "count", 2, kMaxStates, tableCtx);
    m->dfFirstStateTime = GetFiniteNumber(table, "firstTime", tableCtx);
    m->dfStateInterval = GetFiniteNumber(table, "interval", tableCtx);
    m->dfLastStateTime = m->dfFirstStateTime + (m->nNumStates - 1) * m->dfStateInterval;
    const json& refinement = RequireObjectField(section, "refinement", ctx);
    for (const RefinementField& f : kRefinement) {
        GetFiniteArray(refinement, f.pszName, f.nCount, f.pfnOf(*m), ctx.Child("refinement"));
    }
    ReadControlPoints(section, *m, ctx);
    if (envelope.nPixels != m->sSensor.nNumPixels || envelope.nLines != m->nNumScanLines) {
        LUMO_CLI_FAIL(envelope.osSource + ": the envelope's size " +
                      std::to_string(envelope.nPixels) + " x " + std::to_string(envelope.nLines) +
                      " disagrees with the scanner's " + std::to_string(m->sSensor.nNumPixels) +
                      " pixels and " + std::to_string(m->nNumScanLines) + " scan lines");
    }
    CheckedLrsCall(envelope.osSource, [&m] { LRSSetupCoordinateMapping(m.get()); });
    return m;
}

std::shared_ptr<void> ReadLrsRecord(const ModelEnvelope& envelope, const json& section) {
    LrsPtr m = LrsFromJson(envelope, section);
    return std::shared_ptr<void>(m.release(),
                                 [](void* p) { delete static_cast<LRSOrbitModel_t*>(p); });
}

json LrsToJson(const LRSOrbitModel_t& m) {
    CheckedLrsCall("cannot write model", [&m] { LRSCheckOrbitModel(&m); });
    json document = MakeEnvelope("lrs", kLrsGeosys, nullptr, m.sSensor.nNumPixels, m.nNumScanLines);
    json section = json::object();
    section["epochYear"] = m.nEpochYear;
    section["epochSecondOfYear"] = m.dfEpochSecOfYear;
    section["timeOrigin"] = m.dfTimeOrigin;
    section["timeEnd"] = m.dfTimeEnd;
    section["greenwichAngle"] = m.dfGreenwichAngle;
    section["meanElements"] =
        FiniteNumberArray(m.adfMeanElements, LRS_NUM_ELEMENTS, ItemOf("item", "meanElements"));
    json scanner = json::object();
    for (const SensorField& f : kSensorFields) scanner[f.pszName] = m.sSensor.*f.pMember;
    scanner["pixels"] = m.sSensor.nNumPixels;
    section["scanner"] = std::move(scanner);
    section["scanLines"] = m.nNumScanLines;
    section["stateTable"] = {{"count", m.nNumStates},
                             {"firstTime", m.dfFirstStateTime},
                             {"interval", m.dfStateInterval}};
    json refinement = json::object();
    auto& sValues = const_cast<LRSOrbitModel_t&>(m);  // only read
    for (const RefinementField& f : kRefinement) {
        refinement[f.pszName] =
            FiniteNumberArray(f.pfnOf(sValues), f.nCount, ItemOf("item", f.pszName));
    }
    section["refinement"] = std::move(refinement);
    json points = json::array();
    for (const ControlPoint_t& c : m.asControlPoints) {
        const double v[5] = {c.dfImageX, c.dfImageY, c.dfGroundX, c.dfGroundY, c.dfGroundZ};
        points.push_back(FiniteNumberArray(v, 5, ItemOf("item", "controlPoints")));
    }
    section["controlPoints"] = std::move(points);
    document["lrs"] = std::move(section);
    return document;
}

void RunLrsFit(PointSet& gcps, const std::string& segmentPath, const std::string& geosys,
               const std::string& outputPath, CommandContext& context) {
    if (segmentPath.empty()) LUMO_CLI_FAIL("--model lrs needs --segment");
    SegmentPtr psSegment = ReadSegmentFile(segmentPath);
    LRSOrbitModel_t model;
    CheckedLrsCall(segmentPath, [&] {
        LRSInitOrbitModel(psSegment.get(), &model);
        LRSSetupCoordinateMapping(&model);
    });
    // Control points in longitude and latitude: declared others are converted.
    if (!geosys.empty()) {
        const Georef given = GeographicGeoref(geosys, GeosysWhere(gcps, geosys));
        WarnOutsideUTMBand(given.sProj, gcps, "lumo fit", context.err);
        GroundInModelSystem(gcps, given, GeographicGeoref(kLrsGeosys, "the orbit model"),
                            kFailedToImage, context.err);
    }
    std::vector<ControlPoint_t> asPoints;
    for (const PointRecord& p : gcps.asPoints) {
        if (p.Failed())
            LUMO_CLI_FAIL(gcps.osSource + ":" + std::to_string(p.nSourceLine) + ": " + p.osProblem);
        asPoints.push_back({p.dfPixel, p.dfLine, p.dfX, p.dfY, p.dfZ});
    }
    int nMissedBefore = 0, nMissedAfter = 0;
    const double dfBefore = RmsResidual(model, asPoints, nMissedBefore);
    CheckedLrsCall(gcps.osSource, [&] {
        const Activity activity("lumo fit: refining the orbit model with " +
                                std::to_string(asPoints.size()) + " control points");
        LRSRefineOrbitModel(&model, asPoints.data(), static_cast<int>(asPoints.size()));
        LRSSetupCoordinateMapping(&model);
    });
    const double dfAfter = RmsResidual(model, asPoints, nMissedAfter);
    WriteModelFile(outputPath, LrsToJson(model));
    context.out << "fitted lrs: pass of " << model.nNumScanLines << " scan lines, epoch "
                << model.nEpochYear << " day " << Number(1.0 + model.dfEpochSecOfYear / 86400.0)
                << ", refined with " << asPoints.size() << " control points\n"
                << "rms ground->image: before " << Number(dfBefore) << " px, after "
                << Number(dfAfter) << " px\n"
                << "roll offset " << Number(model.adfRollPoly[1] * 180.0 / 3.141592653589793)
                << " deg, along-track correction "
                << Number(model.adfOrbitCorr[1] * model.adfMeanElements[LRS_ELEM_A]) << " km\n";
    if (nMissedAfter > 0) {
        context.err << "lumo fit: " << nMissedAfter
                    << " control points are not seen by the refined pass\n";
    }
    context.out << "wrote " << outputPath << "\n";
}

}  // namespace lumo::cli
