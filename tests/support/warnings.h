// Collects the numbered warnings reported while the object lives.
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

}  // namespace support
}  // namespace lumo
