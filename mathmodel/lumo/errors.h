// The library's one road for errors. Every numbered error the library raises
// is named here; a fatal report goes through a [[noreturn]] function, so code
// after it is known unreachable to the reader and the compiler alike. Debug
// traces and warnings go to the host's channels; the library writes to the
// standard streams only through PrintUserMessage, for the messages its
// families print by design.
#pragma once

#include <cstdio>

#include "runtime.h"

namespace lumo {

// The host message numbers the library raises, under the library's names.
// The numbers are the host's (nova::MessageNumber); the detail text of each
// report names the bad value, so one number serves every case of its kind.
enum class Err : int {
    // Invalid or inconsistent input: the exceeded image limit of the block
    // adjustment, bad arguments the polynomial and rational function
    // families warn about.
    kBadArgument = nova::kMsgInvalidInput,
    kSensor = nova::kMsgUnsupportedSensor,  // unsupported satellite sensor ("Satellite Sensor")
    kUnit = nova::kMsgUnsupportedUnit,      // unsupported GCP unit or earth model
    // A computation failed or cannot start: singular systems, bad geometry,
    // and input (null arrays, coordinates that are not numbers) without
    // which no model can be computed.
    kComputation = nova::kMsgComputationFailed,
    kImageRange = nova::kMsgImageRange,  // image coordinate out of range ("X_img", "Y_img")
};

// Fatal reports: raised through the host, they never return.
[[noreturn]] void Fatal(Err code, const char* text);
[[noreturn]] void FatalChar(Err code, const char* label, const char* value);
[[noreturn]] void FatalReal(Err code, const char* label, double value, int number);
[[noreturn]] void FatalMsg(Err code);

// Warnings: reported through the host's warning sink; the call returns.
void Warn(Err code, const char* text);
void WarnReal(Err code, const char* label, double value, int number);
void WarnMsg(Err code);

// True when the host's debug log is on, so callers format nothing otherwise.
bool TraceOn();
// One debug record, module "lumokit", at `level`, from source `file`:`line`.
void Trace(int level, const char* file, int line, const char* format, ...)
#if defined(__GNUC__)
    __attribute__((format(printf, 4, 5)))
#endif
    ;

// A message the library prints to the user by design (standard output or
// standard error), flushed at once so it interleaves with the host's output.
void PrintUserMessage(std::FILE* stream, const char* text);

}  // namespace lumo

// Debug trace from a library source file; formats nothing while logging is off.
#define LUMO_TRACE(level, ...)                                                          \
    do {                                                                                \
        if (::lumo::TraceOn()) ::lumo::Trace((level), __FILE__, __LINE__, __VA_ARGS__); \
    } while (0)
