// Progress of long work on standard error. It is shown only when standard
// error is a terminal (so redirected output and logs stay clean) and only
// once the work has taken a second (so quick runs stay quiet). The
// environment variable LUMO_PROGRESS=always shows it at once whatever the
// output is, LUMO_PROGRESS=never hides it.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <mutex>
#include <string>
#include <thread>

namespace lumo::cli {

// How progress is shown in this run.
struct ProgressPolicy {
    bool bEnabled = false;
    std::chrono::milliseconds oDelay{1000};  // quiet before this much time has passed
};
// From the terminal and LUMO_PROGRESS.
ProgressPolicy DefaultProgressPolicy();

// Work of a known number of steps: "label  42%".
class Progress {
  public:
    Progress(std::string label, std::size_t total);
    Progress(std::string label, std::size_t total, ProgressPolicy policy);
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;
    ~Progress();

    // Reports that `done` steps are complete; redraws at most once per percent.
    void Update(std::size_t done);

  private:
    std::string mosLabel;
    std::size_t mnTotal;
    ProgressPolicy msPolicy;
    std::chrono::steady_clock::time_point mtStart;
    int mnShownPercent = -1;
};

// One long call whose steps cannot be counted (a fit, an adjustment): shows
// "label... 3 s" and updates it every second from a ticker thread until the
// object goes.
class Activity {
  public:
    explicit Activity(std::string label);
    Activity(std::string label, ProgressPolicy policy);
    Activity(const Activity&) = delete;
    Activity& operator=(const Activity&) = delete;
    ~Activity();

  private:
    void Run();

    std::string mosLabel;
    ProgressPolicy msPolicy;
    std::chrono::steady_clock::time_point mtStart;
    std::mutex moMutex;
    std::condition_variable moWake;
    bool mbDone = false;
    bool mbShown = false;
    std::thread moTicker;
};

}  // namespace lumo::cli
