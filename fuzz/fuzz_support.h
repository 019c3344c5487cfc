// Pieces every libFuzzer target shares.
#pragma once

#include <cstdlib>

#include "runtime.h"

namespace lumo::fuzz {

// A broken invariant: libFuzzer reports the abort with the input that caused it.
inline void Check(bool bCondition) {
    if (!bCondition) std::abort();
}

// Bad input is expected to warn: warnings go nowhere instead of to standard
// error on every run.
inline void SilenceWarnings() {
    static const bool bDone = [] {
        nova::SetErrorSink([](const nova::ErrorReport&) {});
        return true;
    }();
    (void)bDone;
}

}  // namespace lumo::fuzz
