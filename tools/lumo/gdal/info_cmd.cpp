// `lumo info IMAGE`: what an image carries that lumo can use: size, bands,
// georeferencing, rational polynomials and control points.
#include <memory>
#include <ostream>
#include <string>

#include <CLI/CLI.hpp>

#include "commands.h"
#include "gdal_commands.h"
#include "lumo_gdal.h"
#include "nova/runtime.h"
#include "points_io.h"
#include "rf_io.h"

namespace lumo::cli {
namespace {

std::string CrsName(const std::string& wkt) {
    if (wkt.empty()) return "none";
    try {
        nova::ogc::CRSPtr crs(nova::ogc::utils::CreateCRSFromDefinition(wkt));
        return crs->GetName();
    } catch (const nova::Exception&) {
        return "present, but not one PROJ knows";
    }
}

void PrintBands(const lumo::gdal::ImageInfo& info, std::ostream& out) {
    out << "bands:";
    for (std::size_t b = 0; b < info.aosBandTypes.size(); ++b) {
        out << (b == 0 ? " " : ", ") << b + 1 << " " << info.aosBandTypes[b];
        if (info.abHasNoData[b]) out << " (nodata " << FormatDouble(info.adfNoData[b]) << ")";
    }
    out << "\n";
}

void PrintRpc(const std::string& path, std::ostream& out) {
    try {
        RFPtr rf(lumo::gdal::ReadImageRPC(path));
        out << "rpc: longitude " << FormatDouble(rf->dfXOffset) << " +- "
            << FormatDouble(rf->dfXScale) << ", latitude " << FormatDouble(rf->dfYOffset) << " +- "
            << FormatDouble(rf->dfYScale) << ", height " << FormatDouble(rf->dfZOffset) << " +- "
            << FormatDouble(rf->dfZScale) << " m (ellipsoidal)\n";
    } catch (const nova::Exception& e) {
        out << "rpc: present but unusable: " << e.what() << "\n";
    }
}

void PrintGcps(const lumo::gdal::ImageInfo& info, std::ostream& out) {
    out << "gcps: " << info.asGCPs.size();
    if (info.asGCPs.empty()) {
        out << "\n";
        return;
    }
    out << " in " << CrsName(info.osGCPCRS) << "\n  id,pixel,line,x,y,z\n";
    for (const lumo::gdal::ImageGCP& gcp : info.asGCPs) {
        out << "  " << gcp.osId << "," << FormatDouble(gcp.dfPixel) << ","
            << FormatDouble(gcp.dfLine) << "," << FormatDouble(gcp.dfX) << ","
            << FormatDouble(gcp.dfY) << "," << FormatDouble(gcp.dfZ) << "\n";
    }
}

void RunInfo(const std::string& path, CommandContext& context) {
    const lumo::gdal::ImageInfo info = lumo::gdal::ReadImageInfo(path);
    std::ostream& out = context.out;
    out << path << ": " << info.osDriver << ", " << info.nPixels << " x " << info.nLines
        << " pixels, " << info.aosBandTypes.size() << " band(s)\n";
    PrintBands(info, out);
    out << "crs: " << CrsName(info.osCRS) << "\n";
    if (info.bHasGeoTransform) {
        const double* gt = info.adfGeoTransform;
        out << "geotransform: origin (" << FormatDouble(gt[0]) << ", " << FormatDouble(gt[3])
            << "), pixel (" << FormatDouble(gt[1]) << ", " << FormatDouble(gt[5]) << ")";
        if (gt[2] != 0.0 || gt[4] != 0.0) {
            out << ", rotation (" << FormatDouble(gt[2]) << ", " << FormatDouble(gt[4]) << ")";
        }
        out << "\n";
    }
    if (info.bHasRPC) {
        PrintRpc(path, out);
    } else {
        out << "rpc: none\n";
    }
    PrintGcps(info, out);
}

}  // namespace

void AddInfoCommand(CLI::App& app, CommandContext& context) {
    auto path = std::make_shared<std::string>();
    CLI::App* command = app.add_subcommand(
        "info", "Show an image's size, bands, CRS, rational polynomials and control points");
    command->add_option("IMAGE", *path, "image (any raster GDAL reads)")->required();
    command->callback([path, &context] { RunInfo(*path, context); });
}

}  // namespace lumo::cli
