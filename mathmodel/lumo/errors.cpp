// The library's error road: numbered reports through the host, debug traces
// through the host's log, and the few messages printed by design.
#include "errors.h"

#include <cstdarg>
#include <cstring>
#include <string>

#include "runtime.h"

namespace lumo {
namespace {

int Code(Err code) {
    return static_cast<int>(code);
}

// The host's fatal reports throw; should a host ever return, the operation
// must still end here rather than run on with released or missing state.
[[noreturn]] void Unreachable(Err code) {
    throw nova::NumberedError(Code(code), "fatal error report returned to the library");
}

// The source path as the debug log names it: from "mathmodel/lumo/" on,
// without the extension.
std::string SourceTag(const char* file) {
    std::string osPath(file != nullptr ? file : "");
    const std::size_t nStart = osPath.rfind("mathmodel/lumo/");
    if (nStart != std::string::npos) osPath.erase(0, nStart);
    const std::size_t nDot = osPath.rfind('.');
    const std::size_t nSlash = osPath.rfind('/');
    if (nDot != std::string::npos && (nSlash == std::string::npos || nDot > nSlash)) {
        osPath.erase(nDot);
    }
    return osPath;
}

}  // namespace

void Fatal(Err code, const char* text) {
    nova::RaiseNumbered(Code(code), text);
}

void FatalChar(Err code, const char* label, const char* value) {
    IMPErrChar(Code(code), 1, label, value);
    Unreachable(code);
}

void FatalReal(Err code, const char* label, double value, int number) {
    IMPErrReal(Code(code), 1, label, value, number);
    Unreachable(code);
}

void FatalMsg(Err code) {
    IMPErrMsg(Code(code), 1);
    Unreachable(code);
}

void Warn(Err code, const char* text) {
    IMPError(Code(code), 0, text);
}

void WarnReal(Err code, const char* label, double value, int number) {
    IMPErrReal(Code(code), 0, label, value, number);
}

void WarnMsg(Err code) {
    IMPErrMsg(Code(code), 0);
}

bool TraceOn() {
    return nova::diag::Debugger::GetDebugLevel() != 0;
}

void Trace(int level, const char* file, int line, const char* format, ...) {
    if (!TraceOn()) return;
    va_list args;
    va_start(args, format);
    va_list copy;
    va_copy(copy, args);
    const int nLength = std::vsnprintf(nullptr, 0, format, copy);
    va_end(copy);
    std::string osMessage(nLength > 0 ? static_cast<std::size_t>(nLength) : 0U, '\0');
    if (nLength > 0) std::vsnprintf(osMessage.data(), osMessage.size() + 1, format, args);
    va_end(args);
    nova::diag::Debugger::Debug(osMessage, level, "lumokit", SourceTag(file).c_str(), line);
}

void PrintUserMessage(std::FILE* stream, const char* text) {
    std::fputs(text, stream);
    std::fflush(stream);
}

}  // namespace lumo
