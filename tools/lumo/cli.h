// Entry of the lumo command-line tool.
#pragma once

#include <iosfwd>

namespace lumo::cli {

// Runs the tool with the given arguments, writing results to `out` and
// messages to `err`. Returns the process exit code: 0 on success, non-zero
// on a usage error or a failure (the message is on `err`).
int RunLumo(int argc, char** argv, std::ostream& out, std::ostream& err);
// The same on standard output and standard error.
int RunLumo(int argc, char** argv);

}  // namespace lumo::cli
