// Collects the numbered warnings, or the debug records, reported while the
// object lives.
#pragma once

#include <vector>

#include "runtime.h"

namespace lumo {
namespace support {

class WarningCapture {
  public:
    WarningCapture() {
        moPrevious =
            nova::SetErrorSink([this](const nova::ErrorReport& r) { maoReports.push_back(r); });
    }
    ~WarningCapture() { nova::SetErrorSink(moPrevious); }
    WarningCapture(const WarningCapture&) = delete;
    WarningCapture& operator=(const WarningCapture&) = delete;

    std::vector<int> Codes() const {
        std::vector<int> anCodes;
        for (const nova::ErrorReport& r : maoReports) anCodes.push_back(r.nCode);
        return anCodes;
    }
    std::vector<nova::ErrorReport> maoReports;

  private:
    nova::ErrorSink moPrevious;
};

// Sets the debug level and collects the debug records while the object
// lives; the former level and sink come back after.
class DebugCapture {
  public:
    explicit DebugCapture(int nLevel) : mnPreviousLevel(nova::diag::Debugger::moDebugLevel) {
        nova::diag::Debugger::SetDebugLevel(nLevel);
        moPrevious = nova::diag::Debugger::SetSink(
            [this](const nova::diag::DebugRecord& r) { maoRecords.push_back(r); });
    }
    ~DebugCapture() {
        nova::diag::Debugger::SetSink(moPrevious);
        nova::diag::Debugger::SetDebugLevel(mnPreviousLevel);
    }
    DebugCapture(const DebugCapture&) = delete;
    DebugCapture& operator=(const DebugCapture&) = delete;

    std::vector<nova::diag::DebugRecord> maoRecords;

  private:
    int mnPreviousLevel;
    nova::diag::Debugger::Sink moPrevious;
};

}  // namespace support
}  // namespace lumo
