// Splitting of large evaluations across the machine's cores.
//
// The array and block evaluations of the math-model interface and the batch
// forms of the library hand ranges of their points to worker threads that
// live for one call only: no thread outlives the call, nothing is shared
// between calls, and a call made from several host threads at once is safe.
// Each point's result depends only on its inputs, so the results are the
// same bit for bit whatever the number of threads.
#pragma once

#include <cstddef>
#include <functional>

namespace nova {

// Largest thread count accepted.
constexpr int kMaxEvaluationThreads = 256;

// Sets how many threads one evaluation may use: 1 keeps every evaluation on
// the caller's thread; 0 returns to the default, which is the environment
// variable LUMO_THREADS when it holds a count from 1 to 256, otherwise the
// number of processors. A value outside 0..256 is refused with a numbered
// warning naming it, and the setting stays as it was.
void SetEvaluationThreads(int nThreads);
// The thread count in force (at least 1).
int GetEvaluationThreads();

// Calls fnRange(begin, end) on contiguous ranges that cover [0, nItems)
// exactly once, on up to GetEvaluationThreads() threads, the caller's one
// included. Ranges hold at least nMinItems items (one range, on the
// caller's thread, when nItems is below twice that): splitting small work
// would cost more than it saves. Returns when every range is done; an
// exception thrown by fnRange is thrown again here, after the other ranges
// have finished (the one of the lowest range when several threw).
void ForEachRange(std::size_t nItems, std::size_t nMinItems,
                  const std::function<void(std::size_t, std::size_t)>& fnRange);

}  // namespace nova
