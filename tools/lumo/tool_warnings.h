// Warnings of the library and the host services during a run of the tool.
// Their reports carry a heading from the host's catalogue ("E100:
// Computation failed: ...") that reads wrongly on a run that succeeded; the
// tool shows the detail alone, and steps whose outcome the tool explains
// itself collect the reports instead of showing them.
#pragma once

#include <ostream>
#include <string>
#include <vector>

#include "nova/runtime.h"

namespace lumo::cli {

// The detail of a report: its text without the "E<code>: <catalogue>" heading.
std::string WarningDetail(const nova::ErrorReport& report);

// Shows every warning of the run on `err` as "lumo: warning: <detail>"
// while alive.
class ToolWarnings {
  public:
    explicit ToolWarnings(std::ostream& err);
    ToolWarnings(const ToolWarnings&) = delete;
    ToolWarnings& operator=(const ToolWarnings&) = delete;
    ~ToolWarnings();

  private:
    nova::ErrorSink moPrevious;
};

// Collects the warnings of one step while alive, for the step to explain.
class WarningCapture {
  public:
    WarningCapture();
    WarningCapture(const WarningCapture&) = delete;
    WarningCapture& operator=(const WarningCapture&) = delete;
    ~WarningCapture();

    const std::vector<nova::ErrorReport>& Reports() const { return maoReports; }

  private:
    nova::ErrorSink moPrevious;
    std::vector<nova::ErrorReport> maoReports;
};

}  // namespace lumo::cli
