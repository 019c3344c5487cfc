#include "progress.h"

#include <unistd.h>

#include <cstdio>
#include <utility>

namespace lumo::cli {

bool StderrIsTerminal() {
    return isatty(STDERR_FILENO) == 1;
}

Progress::Progress(std::string label, std::size_t total)
    : Progress(std::move(label), total, StderrIsTerminal()) {}

Progress::Progress(std::string label, std::size_t total, bool enabled)
    : mosLabel(std::move(label)), mnTotal(total), mbEnabled(enabled) {}

Progress::~Progress() {
    if (mbEnabled && mnShownPercent >= 0) {
        // Clear the line so the next message starts on a clean row.
        std::fprintf(stderr, "\r%*s\r", static_cast<int>(mosLabel.size()) + 8, "");
        std::fflush(stderr);
    }
}

void Progress::Update(std::size_t done) {
    if (!mbEnabled || mnTotal == 0) return;
    if (done > mnTotal) done = mnTotal;
    const int percent = static_cast<int>(done * 100 / mnTotal);
    if (percent != mnShownPercent) Draw(percent);
}

void Progress::Draw(int percent) {
    mnShownPercent = percent;
    std::fprintf(stderr, "\r%s %3d%%", mosLabel.c_str(), percent);
    std::fflush(stderr);
}

}  // namespace lumo::cli
