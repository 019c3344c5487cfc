// Error reporting of the lumo tool: bad input files and arguments throw a
// host data exception whose message names the file, the field or line and
// the offending value.
#pragma once

#include <string>

#include "nova/runtime.h"

#define LUMO_CLI_FAIL(message) throw nova::DataException((message), __FILE__, __func__, __LINE__)

namespace lumo::cli {

// The text in double quotes, for messages.
inline std::string Quoted(const std::string& text) {
    return "\"" + text + "\"";
}

}  // namespace lumo::cli
