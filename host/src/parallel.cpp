// Worker threads of the evaluations. Ranges are handed out from a counter
// shared by the threads of one call, so a thread slowed by other load on the
// machine simply takes fewer of them.
#include "nova/parallel.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <exception>
#include <system_error>
#include <thread>
#include <vector>

#include "nova/runtime.h"

namespace nova {
namespace {

// Ranges per thread: several, so that the threads finish close together.
constexpr std::size_t kRangesPerThread = 4;

int ProcessorCount() {
    const unsigned n = std::thread::hardware_concurrency();
    return n == 0 ? 1 : static_cast<int>(std::min<unsigned>(n, kMaxEvaluationThreads));
}

// LUMO_THREADS when set to a usable count, else the processors; read once.
int DefaultThreads() {
    static const int nDefault = [] {
        const char* pszValue = std::getenv("LUMO_THREADS");
        if (pszValue == nullptr || *pszValue == '\0') return ProcessorCount();
        char* pszEnd = nullptr;
        errno = 0;
        const long nValue = std::strtol(pszValue, &pszEnd, 10);
        if (errno != 0 || *pszEnd != '\0' || nValue < 1 || nValue > kMaxEvaluationThreads) {
            IMPError(kMsgInvalidInput, 0,
                     FormatString("LUMO_THREADS=\"%s\" is not a thread count from 1 to %d; "
                                  "using %d threads",
                                  pszValue, kMaxEvaluationThreads, ProcessorCount())
                         .c_str());
            return ProcessorCount();
        }
        return static_cast<int>(nValue);
    }();
    return nDefault;
}

std::atomic<int> gnThreads{0};  // 0: the default

}  // namespace

void SetEvaluationThreads(int nThreads) {
    if (nThreads < 0 || nThreads > kMaxEvaluationThreads) {
        IMPError(kMsgInvalidInput, 0,
                 FormatString("evaluation thread count %d is outside 0 to %d; it stays %d",
                              nThreads, kMaxEvaluationThreads, GetEvaluationThreads())
                     .c_str());
        return;
    }
    gnThreads.store(nThreads, std::memory_order_relaxed);
}

int GetEvaluationThreads() {
    const int nThreads = gnThreads.load(std::memory_order_relaxed);
    return nThreads > 0 ? nThreads : DefaultThreads();
}

void ForEachRange(std::size_t nItems, std::size_t nMinItems,
                  const std::function<void(std::size_t, std::size_t)>& fnRange) {
    const std::size_t nMin = std::max<std::size_t>(nMinItems, 1);
    const std::size_t nThreads =
        std::min(static_cast<std::size_t>(GetEvaluationThreads()), nItems / nMin);
    if (nThreads <= 1) {
        if (nItems > 0) fnRange(0, nItems);
        return;
    }
    const std::size_t nRanges = std::min(nThreads * kRangesPerThread, nItems / nMin);
    // Range r starts at r * nItems / nRanges, written so as not to overflow.
    const std::size_t nBase = nItems / nRanges;
    const std::size_t nExtra = nItems % nRanges;
    auto Start = [&](std::size_t r) { return r * nBase + std::min(r, nExtra); };

    std::atomic<std::size_t> nNext{0};
    std::vector<std::exception_ptr> aoErrors(nRanges);
    auto Work = [&] {
        for (std::size_t r = nNext++; r < nRanges; r = nNext++) {
            try {
                fnRange(Start(r), Start(r + 1));
            } catch (...) {
                aoErrors[r] = std::current_exception();
            }
        }
    };
    std::vector<std::thread> aoThreads;
    aoThreads.reserve(nThreads - 1);
    for (std::size_t i = 1; i < nThreads; ++i) {
        try {
            aoThreads.emplace_back(Work);
        } catch (const std::system_error&) {
            break;  // no more threads to be had: those running share the ranges
        }
    }
    Work();
    for (std::thread& oThread : aoThreads) oThread.join();
    for (const std::exception_ptr& oError : aoErrors)
        if (oError) std::rethrow_exception(oError);
}

}  // namespace nova
