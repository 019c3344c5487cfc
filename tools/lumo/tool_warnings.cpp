#include "tool_warnings.h"

#include <utility>

namespace lumo::cli {

std::string WarningDetail(const nova::ErrorReport& report) {
    const std::string heading =
        "E" + std::to_string(report.nCode) + ": " + nova::ErrorCatalogueText(report.nCode);
    if (report.osText.compare(0, heading.size(), heading) != 0) return report.osText;
    if (report.osText.size() == heading.size()) return nova::ErrorCatalogueText(report.nCode);
    return report.osText.substr(heading.size() + 2);  // past ": "
}

ToolWarnings::ToolWarnings(std::ostream& err)
    : moPrevious(nova::SetErrorSink([&err](const nova::ErrorReport& report) {
          err << "lumo: warning: " << WarningDetail(report) << '\n';
      })) {}

ToolWarnings::~ToolWarnings() {
    nova::SetErrorSink(std::move(moPrevious));
}

WarningCapture::WarningCapture()
    : moPrevious(nova::SetErrorSink(
          [this](const nova::ErrorReport& report) { maoReports.push_back(report); })) {}

WarningCapture::~WarningCapture() {
    nova::SetErrorSink(std::move(moPrevious));
}

}  // namespace lumo::cli
