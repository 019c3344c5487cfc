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

// A value from a file as a message may show it: at most 60 characters, and
// bytes that are not printable shown as '?', so that a binary file does not
// write its bytes to the terminal.
inline std::string Shown(const std::string& text) {
    constexpr std::size_t kMaxShown = 60;
    std::string shown;
    for (std::size_t i = 0; i < text.size() && i < kMaxShown; ++i) {
        const auto c = static_cast<unsigned char>(text[i]);
        shown += c >= 0x20 && c < 0x7f ? text[i] : '?';
    }
    if (text.size() > kMaxShown) shown += "...";
    return shown;
}

}  // namespace lumo::cli
