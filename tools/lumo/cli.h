// Entry of the lumo command-line tool.
#pragma once

#include <iosfwd>

namespace lumo::cli {

// Runs the tool with the given arguments, writing results to `out` and
// messages to `err`. Returns the process exit code: 0 on success, 1 when the
// operation failed, 2 on a usage error, 3 when a run completed but some
// points failed (docs/cli.md; the message is on `err`).
int RunLumo(int argc, char** argv, std::ostream& out, std::ostream& err);
// The same on standard output and standard error.
int RunLumo(int argc, char** argv);

}  // namespace lumo::cli
