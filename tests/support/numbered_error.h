// The numbered error or the data exception a call raises, for the tests of
// failure paths.
#pragma once

#include <string>
#include <utility>

#include "runtime.h"

namespace lumo {
namespace support {

// Runs fn and returns the number and full text of the fatal numbered error
// it raises; {0, ""} when it raises none.
template <typename F>
std::pair<int, std::string> FatalOf(F fn) {
    try {
        fn();
    } catch (const nova::NumberedError& e) {
        return {e.GetCode(), e.what()};
    }
    return {0, std::string()};
}

// Runs fn and returns the message of the nova::DataException it throws; ""
// when it throws none.
template <typename F>
std::string DataErrorOf(F fn) {
    try {
        fn();
    } catch (const nova::DataException& e) {
        return e.what();
    }
    return std::string();
}

}  // namespace support
}  // namespace lumo
