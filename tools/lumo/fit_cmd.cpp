// `lumo fit --model poly|tps|srit|rf --gcps FILE ... -o MODEL`: fits a
// polynomial or thin plate spline model to control points, both directions,
// and writes it as a model file; the rigorous model and the rational
// function adjustment have their own files.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <limits>
#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include "cli_error.h"
#include "commands.h"
#include "control_points.h"
#include "fit_refine.h"
#include "geosys_option.h"
#include "lrs_io.h"
#include "nova/projection.h"
#include "nova/regression.h"
#include "points_io.h"
#include "progress.h"
#include "srit_io.h"
#include "tool_warnings.h"
#include "tps_io.h"

namespace lumo::cli {
namespace {

// The model file keeps the fit as the regression made it, which lumo
// evaluates, and the record's raw-coordinate coefficients for hosts that
// read only those. For high orders over large ground coordinates (UTM
// eastings and northings) the raw coefficients cancel huge terms and lose
// digits; a loss above this share of the fit's own residual gets a note.
constexpr double kRawNoteShare = 0.01;
constexpr double kRawNoteFloorPixels = 1e-6;

struct FitOptions {
    std::string osModel;
    std::string osGcps;
    std::string osGeosys;
    std::string osOutput;
    std::string osSegment;    // srit, rtcs and lrs only
    std::string osHeightRef;  // rtcs only
    std::string osRpc;        // rf only
    std::string osAdjust;     // rf only
    int nOrder = 0;           // 0: not given
    int nPixels = -1;         // -1: from the control points
    int nLines = -1;
    bool bAllowLowerOrder = false;  // write a lower order than asked for instead of failing
    PointFileOptions sPoints;       // --height
    std::string osRefine;           // --refine TOLERANCE[,MIN_POINTS]
    std::string osElevationScale = "curved";  // srit only
};

std::string Number(double value) {
    char text[32];
    std::snprintf(text, sizeof text, "%.6g", value);
    return text;
}

// Image size: given, or the smallest whole size whose image [0, size) holds
// every control point.
void ImageSize(const FitOptions& options, const ControlArrays& c, int& nPixels, int& nLines) {
    double maxPixel = 0.0;
    double maxLine = 0.0;
    for (int i = 0; i < c.Count(); ++i) {
        maxPixel = std::max(maxPixel, c.pixel[i]);
        maxLine = std::max(maxLine, c.line[i]);
    }
    const double limit = std::numeric_limits<int>::max();
    nPixels = options.nPixels >= 0 ? options.nPixels
                                   : static_cast<int>(std::min(std::floor(maxPixel) + 1.0, limit));
    nLines = options.nLines >= 0 ? options.nLines
                                 : static_cast<int>(std::min(std::floor(maxLine) + 1.0, limit));
}

// Ground size of one pixel from the image-to-ground affine part, so that the
// raw-coefficient check of that direction can be made in pixels too.
double GroundPerPixel(const GEOInfo_t& inverse) {
    const double area = std::fabs(inverse.adfAffine[1] * inverse.adfAffine[5] -
                                  inverse.adfAffine[2] * inverse.adfAffine[4]);
    const double size = std::sqrt(area);
    return size > 0.0 && std::isfinite(size) ? size : 1.0;
}

// Largest difference, in pixels, between the written raw coefficients and the
// regression's own (normalised) evaluation on the control points.
double RawCoefficientError(const POLYInfo_t& poly, const GEOInfo_t& forward,
                           const GEOInfo_t& inverse, const ControlArrays& c) {
    const double groundPerPixel = GroundPerPixel(inverse);
    double worst = 0.0;
    for (int i = 0; i < c.Count(); ++i) {
        double rawPixel = 0, rawLine = 0, fitPixel = 0, fitLine = 0;
        POLYGeo2Img(&poly, c.x[i], c.y[i], &rawPixel, &rawLine);
        GCPTransform(&forward, c.x[i], c.y[i], &fitPixel, &fitLine);
        worst = std::max({worst, std::fabs(rawPixel - fitPixel), std::fabs(rawLine - fitLine)});
        double rawX = 0, rawY = 0, fitX = 0, fitY = 0;
        POLYImg2Geo(&poly, c.pixel[i], c.line[i], &rawX, &rawY);
        GCPTransform(&inverse, c.pixel[i], c.line[i], &fitX, &fitY);
        worst = std::max({worst, std::fabs(rawX - fitX) / groundPerPixel,
                          std::fabs(rawY - fitY) / groundPerPixel});
    }
    // A NaN difference counts as a total loss.
    return std::isnan(worst) ? std::numeric_limits<double>::infinity() : worst;
}

// Why a regression fitted less than the order asked for; empty when it did not.
std::string LoweredReason(const GEOInfo_t& fit, int requested) {
    const std::string points = "the " + std::to_string(fit.nPoints) + " control points ";
    if (fit.nFitKind == GCP_FIT_SHIFT) return points + "are all at one place (only a shift fits)";
    if (fit.nFitKind == GCP_FIT_SIMILARITY) {
        return points + "are fewer than 3 or collinear (only a rotation, scale and shift fit)";
    }
    if (fit.nOrder >= requested) return "";
    const int terms = (requested + 1) * (requested + 2) / 2;
    return points + "determine only order " + std::to_string(fit.nOrder) + " (order " +
           std::to_string(requested) + " has " + std::to_string(terms) +
           " terms and needs at least as many well-spread points)";
}

// Refuses a fit of lower order than asked for, unless --allow-lower-order.
void CheckFittedOrder(const FitOptions& options, int requested, const GEOInfo_t& forward,
                      const GEOInfo_t& inverse, CommandContext& context) {
    std::string reason = LoweredReason(forward, requested);
    if (reason.empty()) reason = LoweredReason(inverse, requested);
    if (reason.empty()) return;
    const std::string asked = "order " + std::to_string(requested) +
                              (options.nOrder == 0 ? " (the default)" : "") +
                              " was asked for, but " + reason;
    if (!options.bAllowLowerOrder) {
        LUMO_CLI_FAIL(options.osGcps + ": " + asked +
                      "; give --allow-lower-order to write the lower order");
    }
    context.err << "lumo fit: " << asked << "; writing the lower order\n";
}

PolyPtr FitPoly(const FitOptions& options, const ProjInfo_t& proj, ControlArrays& c,
                CommandContext& context, PolyFit* psFit) {
    const int requested = options.nOrder == 0 ? 1 : options.nOrder;
    std::unique_ptr<GEOInfo_t> forward(new GEOInfo_t{});
    std::unique_ptr<GEOInfo_t> inverse(new GEOInfo_t{});
    int orderForward = requested;
    int orderInverse = requested;
    double rmsPixel = 0, rmsLine = 0, rmsX = 0, rmsY = 0;
    const char* unit = proj.szProj;
    {
        const Activity activity("lumo fit: fitting the polynomial to " + std::to_string(c.Count()) +
                                " control points");
        // A lowered order is explained below in the command's own words.
        const WarningCapture lowered;
        GCPRegression2(forward.get(), unit, c.x.data(), c.y.data(), "PIXEL", c.pixel.data(),
                       c.line.data(), c.Count(), &orderForward, 0, &rmsPixel, &rmsLine);
        GCPRegression2(inverse.get(), "PIXEL", c.pixel.data(), c.line.data(), unit, c.x.data(),
                       c.y.data(), c.Count(), &orderInverse, 0, &rmsX, &rmsY);
    }

    PolyPtr poly(POLYAllocate());
    // Both directions share one term count; the lower one's extra terms stay 0.
    poly->nCoeffs = std::max(forward->nTerms, inverse->nTerms);
    std::copy_n(forward->adfXCoeffs, forward->nTerms, poly->padfPixelCoeffs);
    std::copy_n(forward->adfYCoeffs, forward->nTerms, poly->padfLineCoeffs);
    std::copy_n(inverse->adfXCoeffs, inverse->nTerms, poly->padfXCoeffs);
    std::copy_n(inverse->adfYCoeffs, inverse->nTerms, poly->padfYCoeffs);

    *psFit = PolyFit{*forward, *inverse};
    const double rawError = RawCoefficientError(*poly, *forward, *inverse, c);
    const double fitResidual = std::hypot(rmsPixel, rmsLine);
    if (!(rawError <= std::max(kRawNoteShare * fitResidual, kRawNoteFloorPixels))) {
        context.err << "lumo fit: note: with these ground coordinates the raw coefficients, for "
                       "hosts that read only them, reproduce the fit to "
                    << Number(rawError)
                    << " pixels; lumo evaluates the fit the model file keeps, exactly\n";
    }
    CheckFittedOrder(options, requested, *forward, *inverse, context);
    context.out << "fitted poly: order " << std::max(orderForward, orderInverse) << " ("
                << poly->nCoeffs << " terms) to " << c.Count() << " control points\n"
                << "rms ground->image: pixel " << Number(rmsPixel) << ", line " << Number(rmsLine)
                << "\nrms image->ground: x " << Number(rmsX) << ", y " << Number(rmsY)
                << "\nraw coefficients reproduce the fit to " << Number(rawError) << " pixels\n";
    return poly;
}

TpsPtr FitTps(ControlArrays& c, CommandContext& context) {
    TpsPtr tps(TPSAllocate(nullptr));
    bool bCollinear = false;
    {
        const Activity activity("lumo fit: fitting the thin plate spline to " +
                                std::to_string(c.Count()) + " control points");
        // The spline's affine part comes from the polynomial regression, whose
        // warnings speak of polynomial orders; they are said here in the
        // spline's terms.
        const WarningCapture affine;
        TRNCalculate(tps->psGeoToImage, c.Count(), c.x.data(), c.y.data(), c.pixel.data(),
                     c.line.data(), nullptr);
        TRNCalculate(tps->psImageToGeo, c.Count(), c.pixel.data(), c.line.data(), c.x.data(),
                     c.y.data(), nullptr);
        for (const nova::ErrorReport& report : affine.Reports()) {
            bCollinear = bCollinear || report.osText.find("collinear") != std::string::npos;
        }
    }
    const auto* forward = static_cast<const TPSInfo_t*>(tps->psGeoToImage->pModel);
    const auto* inverse = static_cast<const TPSInfo_t*>(tps->psImageToGeo->pModel);
    context.out << "fitted tps: " << c.Count() << " control points, "
                << (forward->nCPs > 0 ? "interpolating" : "affine (fewer than 4 points)")
                << "; rank ground->image " << forward->nRank << ", image->ground " << inverse->nRank
                << "\n";
    if (bCollinear) {
        context.err << "lumo fit: the control points lie on one line: the spline is determined "
                       "along it only, and maps the image across it as a rotation, scale and "
                       "shift; add points off the line\n";
    } else if (forward->nCPs > 0 && forward->nRank < forward->nCPs + 3) {
        context.err << "lumo fit: the spline system is rank deficient (rank " << forward->nRank
                    << " of " << forward->nCPs + 3
                    << "): coincident or duplicate control points?\n";
    }
    return tps;
}

// Ground-to-image polynomial of the given order, fitted to some of the points.
ImageFit PolyImageFit(const ControlArrays& c, const std::string& geosys, int order) {
    return [&c, geosys, order](const std::vector<char>& use, std::vector<double>& pixel,
                               std::vector<double>& line) {
        ControlArrays k = Subset(c, use);
        if (k.Count() < (order + 1) * (order + 2) / 2) return false;
        GEOInfo_t fit{};
        int nOrder = order;
        GCPRegression2(&fit, geosys.c_str(), k.x.data(), k.y.data(), "PIXEL", k.pixel.data(),
                       k.line.data(), k.Count(), &nOrder, 0, nullptr, nullptr);
        if (fit.nFitKind != GCP_FIT_POLYNOMIAL || nOrder != order) return false;
        pixel.resize(c.pixel.size());
        line.resize(c.pixel.size());
        for (int i = 0; i < c.Count(); ++i) GCPTransform(&fit, c.x[i], c.y[i], &pixel[i], &line[i]);
        return true;
    };
}

// Ground-to-image spline through some of the points; false where the
// points make the system singular.
ImageFit TpsImageFit(const ControlArrays& c) {
    return [&c](const std::vector<char>& use, std::vector<double>& pixel,
                std::vector<double>& line) {
        ControlArrays k = Subset(c, use);
        if (k.Count() == 0) return false;
        TPSInfo_t spline(k.Count());
        try {
            TPSCalculate(&spline, k.Count(), k.x.data(), k.y.data(), k.pixel.data(), k.line.data());
        } catch (const nova::NumberedError&) {
            return false;
        }
        pixel.resize(c.pixel.size());
        line.resize(c.pixel.size());
        for (int i = 0; i < c.Count(); ++i) {
            TPSTransform(&spline, c.x[i], c.y[i], &pixel[i], &line[i]);
        }
        return true;
    };
}

// The georeferencing of the control points' ground coordinates: --geosys,
// else the file's "# geosys:" comment (the two must agree).
std::string FitGeosys(const FitOptions& options, const PointSet& gcps) {
    if (options.osGeosys.empty() || gcps.osGeosys.empty()) {
        return options.osGeosys.empty() ? gcps.osGeosys : options.osGeosys;
    }
    PointFileOptions given = options.sPoints;
    given.osGeosys = options.osGeosys;
    DeclaredGeoref(gcps, given);  // refuses a contradiction
    return options.osGeosys;
}

void RunFit(const FitOptions& options, CommandContext& context) {
    if (options.osModel != "poly" && options.nOrder != 0) {
        throw CLI::ValidationError("--order applies to --model poly only");
    }
    if (options.osModel != "poly" && options.bAllowLowerOrder) {
        throw CLI::ValidationError("--allow-lower-order applies to --model poly only");
    }
    const bool bRadar = options.osModel == "rtcs";
    const bool bOrbit = options.osModel == "lrs";
    if (options.osModel != "srit" && !bRadar && !bOrbit && !options.osSegment.empty()) {
        throw CLI::ValidationError("--segment applies to --model srit, rtcs and lrs only");
    }
    if (!bRadar && !options.osHeightRef.empty()) {
        throw CLI::ValidationError("--height-ref applies to --model rtcs only");
    }
    if (options.osModel != "rf" && (!options.osRpc.empty() || !options.osAdjust.empty())) {
        throw CLI::ValidationError("--rpc and --adjust apply to --model rf only");
    }
    if (options.osModel == "tps" && !options.osRefine.empty()) {
        throw CLI::ValidationError(
            "--refine does not apply to --model tps: a spline passes through every control "
            "point; its leave-one-out residuals are reported without it");
    }
    if ((bRadar || bOrbit) && !options.osRefine.empty()) {
        throw CLI::ValidationError("--refine applies to --model poly, srit and rf");
    }
    const RefineOptions refine =
        options.osRefine.empty() ? RefineOptions{} : ParseRefine(options.osRefine);
    // Control points stored in an image bring their CRS and the image size.
    ControlPointSource source = ReadControlPointSource(options.osGcps);
    PointSet& gcps = source.sPoints;
    NoteDisabledPoints(gcps, "lumo fit", context.err);
    if (gcps.asPoints.empty()) LUMO_CLI_FAIL(options.osGcps + ": holds no control points");
    FitOptions given = options;
    if (given.nPixels < 0) given.nPixels = source.nPixels;
    if (given.nLines < 0) given.nLines = source.nLines;
    if (options.osModel == "rf") {
        ApplyHeights(gcps, options.sPoints, true, "the rational function model");
        RFFitOptions rf;
        rf.osRpc = options.osRpc;
        if (!options.osAdjust.empty()) rf.osAdjust = options.osAdjust;
        rf.osOutput = options.osOutput;
        rf.nPixels = given.nPixels;
        rf.nLines = given.nLines;
        rf.sPoints = options.sPoints;
        rf.sPoints.osGeosys = options.osGeosys;
        rf.sRefine = refine;
        RunRFFit(gcps, rf, context);
        return;
    }
    const bool bRigorous = options.osModel == "srit";
    ApplyHeights(gcps, options.sPoints, bRigorous || bRadar || bOrbit,
                 bRadar   ? "the radar model"
                 : bOrbit ? "the orbit model"
                          : "the rigorous model");
    const std::string geosys = FitGeosys(options, gcps);
    if (bOrbit) {
        RunLrsFit(gcps, options.osSegment, geosys, options.osOutput, context);
        return;
    }
    if (bRigorous) {
        SritFitOptions srit;
        srit.osSegment = options.osSegment;
        srit.osOutput = options.osOutput;
        srit.nForm = FormOfWord(options.osElevationScale);
        srit.sRefine = refine;
        RunSritFit(gcps, srit, geosys, context);
        return;
    }
    if (bRadar) {
        RunRtcsFit(gcps, options.osSegment, geosys, options.osHeightRef, options.osOutput, context);
        return;
    }
    if (geosys.empty()) {
        throw CLI::ValidationError(
            "--geosys is required for --model poly and tps (or a \"# geosys:\" line in the "
            "control point file)");
    }
    const ProjInfo_t projInfo = UserGeosys(
        geosys, options.osGeosys.empty() ? options.osGcps + ": \"# geosys:\"" : "--geosys");
    ControlArrays c = ToArrays(gcps);
    WarnOutsideUTMBand(projInfo, c.x, c.y, "lumo fit", context.err);
    const bool bPoly = options.osModel == "poly";
    const int requested = options.nOrder == 0 ? 1 : options.nOrder;
    const FitResiduals residuals =
        bPoly ? RefineAndMeasure(PolyImageFit(c, geosys, requested), gcps,
                                 (requested + 1) * (requested + 2) / 2, refine)
              : RefineAndMeasure(TpsImageFit(c), gcps, 1, refine);
    if (!residuals.anDropped.empty()) c = ToArrays(KeptPoints(gcps, residuals));
    int nPixels = 0;
    int nLines = 0;
    ImageSize(given, c, nPixels, nLines);

    nlohmann::json document;
    if (options.osModel == "poly") {
        PolyFit fit{};
        PolyPtr poly = FitPoly(options, projInfo, c, context, &fit);
        poly->nPixels = nPixels;
        poly->nLines = nLines;
        StoreGeosys(projInfo, poly->pszGeosys, POLY_GEOSYS_SIZE, "--geosys");
        *poly->psProjInfo = projInfo;
        document = PolyToJson(*poly, &fit);
    } else {
        TpsPtr tps = FitTps(c, context);
        tps->nPixels = nPixels;
        tps->nLines = nLines;
        StoreGeosys(projInfo, tps->pszGeosys, TPS_GEOSYS_SIZE, "--geosys");
        *tps->psProjInfo = projInfo;
        document = TpsToJson(*tps);
    }
    PrintPointResiduals(context.out, gcps, residuals);
    WriteModelFile(options.osOutput, document);
    context.out << "wrote " << options.osOutput << "\n";
}

}  // namespace

void AddFitCommand(CLI::App& app, CommandContext& context) {
    auto options = std::make_shared<FitOptions>();
    CLI::App* command = app.add_subcommand(
        "fit",
        "Fit a polynomial, thin plate spline, rigorous, radar or orbit model to control points, "
        "or adjust a rational function model to them");
    command
        ->add_option("--model", options->osModel, "model family: poly, tps, srit, rtcs, lrs or rf")
        ->required()
        ->check(CLI::IsMember({"poly", "tps", "srit", "rtcs", "lrs", "rf"}));
    command->add_option("--segment", options->osSegment,
                        "ephemeris segment of the image (JSON; srit, rtcs and lrs)");
    command
        ->add_option("--height-ref", options->osHeightRef,
                     "rtcs: heights of the control points are above the ellipsoid (E) or mean "
                     "sea level (M); the model then takes heights the same way")
        ->check(CLI::IsMember({"E", "M"}));
    command->add_option("--rpc", options->osRpc,
                        "rf: the model to adjust (RPC text, binary block or JSON model file)");
    command
        ->add_option("--adjust", options->osAdjust,
                     "rf: image-space adjustment fitted to the control points: shift (1 point "
                     "or more), affine (3; the default) or second (second order, 6)")
        ->check(CLI::IsMember({"shift", "affine", "second"}));
    command
        ->add_option("--gcps", options->osGcps,
                     "control points: CSV with pixel,line,x,y[,z], or an image that stores them")
        ->required();
    AddElevationScaleOption(*command, options->osElevationScale);
    command->add_option("--order", options->nOrder, "polynomial order 1..5 (poly only; default 1)")
        ->check(CLI::Range(1, GCP_MAX_ORDER));
    command->add_option("--geosys", options->osGeosys,
                        "georeferencing text of the ground coordinates, e.g. \"UTM 31 U D000\", "
                        "\"EPSG:32631\", a PROJ string or WKT (srit: default the segment's; rf: "
                        "converted to the model's; lrs: default longitude and latitude)");
    command
        ->add_option("--pixels", options->nPixels,
                     "image width (default: just above the largest control point pixel)")
        ->check(CLI::NonNegativeNumber);
    command
        ->add_option("--lines", options->nLines,
                     "image height (default: just above the largest control point line)")
        ->check(CLI::NonNegativeNumber);
    command->add_flag("--allow-lower-order", options->bAllowLowerOrder,
                      "poly: write the lower order the control points determine instead of "
                      "failing");
    AddHeightOption(*command, options->sPoints);
    command->add_option("--refine", options->osRefine,
                        "TOLERANCE[,MIN_POINTS]: drop the control point with the largest "
                        "leave-one-out residual beyond TOLERANCE pixels and refit, until none "
                        "is beyond it or MIN_POINTS are left (poly, srit, rf)");
    command
        ->add_option("-o,--output", options->osOutput,
                     "model file to write (JSON; rf: .txt, .rpb, .bin or .json by extension)")
        ->required();
    command->callback([options, &context] { RunFit(*options, context); });
}

}  // namespace lumo::cli
