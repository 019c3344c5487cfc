#include "geosys_option.h"

#include <algorithm>
#include <cstring>

#include "cli_error.h"
#include "tool_warnings.h"

namespace lumo::cli {

ProjInfo_t UserGeosys(const std::string& text, const std::string& where) {
    ProjInfo_t proj{};
    InitProjInfo(&proj, 0);
    int result = 0;
    {
        // The projection services' own warning would only repeat the reason.
        const WarningCapture quiet;
        result = Geosys2ProjInfo(&proj, text.c_str(), 0.0, 0.0, 1.0, 1.0);
    }
    if (result < 0) {
        LUMO_CLI_FAIL(where + ": " + Quoted(text) + " cannot be used: " +
                      ExplainGeosys(text.c_str()) + " (see docs/georeferencing.md)");
    }
    return proj;
}

void StoreGeosys(const ProjInfo_t& proj, char* buffer, int bufferSize, const std::string& where) {
    const std::size_t length = strnlen(proj.szProj, sizeof proj.szProj);
    if (length >= static_cast<std::size_t>(bufferSize)) {
        LUMO_CLI_FAIL(where + ": " + Quoted(proj.szProj) + " is longer than the model's " +
                      std::to_string(bufferSize - 1) + " characters");
    }
    std::memcpy(buffer, proj.szProj, length + 1);
}

void WarnOutsideUTMBand(const ProjInfo_t& proj, const std::vector<double>& x,
                        const std::vector<double>& y, const std::string& prefix,
                        std::ostream& err) {
    const std::string advice =
        CheckUTMBand(&proj, x.data(), y.data(), static_cast<int>(std::min(x.size(), y.size())));
    if (!advice.empty()) err << prefix << ": warning: " << advice << '\n';
}

void WarnOutsideUTMBand(const ProjInfo_t& proj, const PointSet& points, const std::string& prefix,
                        std::ostream& err) {
    std::vector<double> x, y;
    for (const PointRecord& r : points.asPoints) {
        x.push_back(r.dfX);
        y.push_back(r.dfY);
    }
    WarnOutsideUTMBand(proj, x, y, prefix, err);
}

std::string GeosysWhere(const PointSet& points, const std::string& geosys) {
    return !points.osGeosys.empty() && points.osGeosys == geosys
               ? points.osSource + ": \"# geosys:\""
               : "--geosys";
}

}  // namespace lumo::cli
