#include "progress.h"

#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <utility>

namespace lumo::cli {
namespace {

using Clock = std::chrono::steady_clock;

// Overwrites the progress line and clears what is left of a longer one.
void DrawLine(const std::string& text) {
    std::fprintf(stderr, "\r%s\033[K", text.c_str());
    std::fflush(stderr);
}

void ClearLine() {
    std::fprintf(stderr, "\r\033[K");
    std::fflush(stderr);
}

}  // namespace

ProgressPolicy DefaultProgressPolicy() {
    ProgressPolicy policy;
    const char* pszMode = std::getenv("LUMO_PROGRESS");
    if (pszMode != nullptr && std::strcmp(pszMode, "always") == 0) {
        policy.bEnabled = true;
        policy.oDelay = std::chrono::milliseconds(0);
    } else if (pszMode != nullptr && std::strcmp(pszMode, "never") == 0) {
        policy.bEnabled = false;
    } else {
        policy.bEnabled = isatty(STDERR_FILENO) == 1;
    }
    return policy;
}

Progress::Progress(std::string label, std::size_t total)
    : Progress(std::move(label), total, DefaultProgressPolicy()) {}

Progress::Progress(std::string label, std::size_t total, ProgressPolicy policy)
    : mosLabel(std::move(label)), mnTotal(total), msPolicy(policy), mtStart(Clock::now()) {}

Progress::~Progress() {
    if (mnShownPercent >= 0) ClearLine();
}

void Progress::Update(std::size_t done) {
    if (!msPolicy.bEnabled || mnTotal == 0) return;
    if (Clock::now() - mtStart < msPolicy.oDelay) return;
    if (done > mnTotal) done = mnTotal;
    const int percent = static_cast<int>(done * 100 / mnTotal);
    if (percent == mnShownPercent) return;
    mnShownPercent = percent;
    char szPercent[16];
    std::snprintf(szPercent, sizeof(szPercent), " %3d%%", percent);
    DrawLine(mosLabel + szPercent);
}

Activity::Activity(std::string label) : Activity(std::move(label), DefaultProgressPolicy()) {}

Activity::Activity(std::string label, ProgressPolicy policy)
    : mosLabel(std::move(label)), msPolicy(policy), mtStart(Clock::now()) {
    if (!msPolicy.bEnabled) return;
    if (msPolicy.oDelay.count() <= 0) {
        // Shown at once: before the work starts, whatever its length.
        DrawLine(mosLabel + "... 0 s");
        mbShown = true;
    }
    moTicker = std::thread(&Activity::Run, this);
}

Activity::~Activity() {
    if (!moTicker.joinable()) return;
    {
        std::lock_guard<std::mutex> lock(moMutex);
        mbDone = true;
    }
    moWake.notify_one();
    moTicker.join();
    if (mbShown) ClearLine();
}

void Activity::Run() {
    std::unique_lock<std::mutex> lock(moMutex);
    auto next = mtStart + std::max(msPolicy.oDelay, std::chrono::milliseconds(1000));
    while (!moWake.wait_until(lock, next, [this] { return mbDone; })) {
        const auto seconds =
            std::chrono::duration_cast<std::chrono::seconds>(Clock::now() - mtStart).count();
        DrawLine(mosLabel + "... " + std::to_string(seconds) + " s");
        mbShown = true;
        next = Clock::now() + std::chrono::seconds(1);
    }
}

}  // namespace lumo::cli
