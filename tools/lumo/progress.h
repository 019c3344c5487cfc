// A progress indicator on standard error, shown only when standard error is a
// terminal so that redirected output and logs stay clean.
#pragma once

#include <cstddef>
#include <string>

namespace lumo::cli {

class Progress {
  public:
    // `total` steps of work described by `label`.
    Progress(std::string label, std::size_t total);
    // Forced on or off (tests, or a caller that knows better than isatty).
    Progress(std::string label, std::size_t total, bool enabled);
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;
    ~Progress();

    // Reports that `done` steps are complete; redraws at most once per percent.
    void Update(std::size_t done);
    bool Enabled() const { return mbEnabled; }

  private:
    void Draw(int percent);

    std::string mosLabel;
    std::size_t mnTotal;
    bool mbEnabled;
    int mnShownPercent = -1;
};

// True when standard error is a terminal.
bool StderrIsTerminal();

}  // namespace lumo::cli
