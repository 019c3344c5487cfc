// Block project files of `lumo block`: one JSON object
// {"format": "lumo-block", "version": 1, ...} naming the images (identifier
// and segment file, relative to the project file), the projection of the
// ground coordinates, the control-point observations and the tie
// observations (docs/files.md).
#pragma once

#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "lumo_types.h"

namespace lumo::cli {

constexpr const char* kBlockFormat = "lumo-block";
constexpr int kBlockFormatVersion = 1;

struct BlockImage {
    std::string osId;
    std::string osSegmentPath;  // resolved against the project's directory
};

// One measurement of a control point in one image. Z (and the standard
// deviations) are LUMO_NULL_VALUE when not given.
struct BlockGcp {
    std::string osImage, osPoint;
    double dfPixel = 0.0, dfLine = 0.0;
    double dfX = 0.0, dfY = 0.0, dfZ = 0.0;
    double dfSdX = LUMO_NULL_VALUE, dfSdY = LUMO_NULL_VALUE, dfSdZ = LUMO_NULL_VALUE;
    bool bCheck = false;
};

// One measurement of a tie point in one image; Z is LUMO_NULL_VALUE when the
// elevation is to be estimated.
struct BlockTie {
    std::string osImage, osPoint;
    double dfPixel = 0.0, dfLine = 0.0;
    double dfZ = LUMO_NULL_VALUE;
};

struct BlockProject {
    std::string osSource;
    std::string osGeosys;  // empty: the first image's segment decides
    std::vector<BlockImage> asImages;
    std::vector<BlockGcp> asGcps;
    std::vector<BlockTie> asTies;
};

// Every failure throws nova::DataException naming the file and the field
// (with its position in arrays).
BlockProject BlockProjectFromJson(const nlohmann::json& document, const std::string& source,
                                  const std::string& baseDirectory);
BlockProject ReadBlockProject(const std::string& path);

}  // namespace lumo::cli
