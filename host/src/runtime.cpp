// Runtime services: allocation, numbered errors, catalogue, text scanning,
// debug log, exceptions and 3-D helpers.
#include "runtime.h"

#include <array>
#include <cerrno>
#include <cmath>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <limits>
#include <string>

namespace {

// ---------------------------------------------------------------------------
// Allocation
// ---------------------------------------------------------------------------

// Largest size we pass to the C allocator: beyond it size_t may not hold the
// request, and no machine could satisfy it anyway.
constexpr std::uint64_t kMaxAllocation = std::numeric_limits<std::size_t>::max() / 2;

[[noreturn]] void ThrowOutOfMemory(std::uint64_t requested) {
    throw nova::OutOfMemoryException(requested);
}

std::size_t CheckedSize(std::uint64_t size) {
    if (size > kMaxAllocation) ThrowOutOfMemory(size);
    // malloc(0) may return null; ask for one byte so a null result always
    // means exhaustion.
    return size == 0 ? 1 : static_cast<std::size_t>(size);
}

// ---------------------------------------------------------------------------
// Error reports
// ---------------------------------------------------------------------------

struct CatalogueEntry {
    int nCode;
    const char* pszText;
};

constexpr std::array<CatalogueEntry, 5> kCatalogue = {{
    {nova::kMsgInvalidInput, "Invalid or inconsistent input"},
    {nova::kMsgUnsupportedSensor, "Unsupported satellite sensor"},
    {nova::kMsgUnsupportedUnit, "Unsupported ground unit or earth model"},
    {nova::kMsgComputationFailed, "Computation failed"},
    {nova::kMsgImageRange, "Image coordinate out of range"},
}};

std::mutex& SinkMutex() {
    static std::mutex oMutex;
    return oMutex;
}

nova::ErrorSink& CurrentSink() {
    static nova::ErrorSink oSink;
    return oSink;
}

std::atomic<std::uint64_t> gnWarnings{0};
thread_local nova::ErrorReport tsLastReport{0, false, std::string()};

void DefaultSink(const nova::ErrorReport& sReport) {
    std::cerr << "lumo warning " << sReport.osText << '\n';
}

// Builds "E<code>: <catalogue text>[: <detail>]".
std::string ComposeReport(int nCode, const std::string& osDetail) {
    std::string osText = "E" + std::to_string(nCode) + ": " + nova::ErrorCatalogueText(nCode);
    if (!osDetail.empty()) osText += ": " + osDetail;
    return osText;
}

[[noreturn]] void ReportFatal(int nCode, const std::string& osDetail) {
    nova::ErrorReport sReport{nCode, true, ComposeReport(nCode, osDetail)};
    tsLastReport = sReport;
    throw nova::NumberedError(nCode, sReport.osText);
}

void Report(int nCode, int bFatal, const std::string& osDetail) {
    if (bFatal) ReportFatal(nCode, osDetail);
    nova::ErrorReport sReport{nCode, false, ComposeReport(nCode, osDetail)};
    tsLastReport = sReport;
    ++gnWarnings;
    nova::ErrorSink oSink;
    {
        std::lock_guard<std::mutex> oLock(SinkMutex());
        oSink = CurrentSink();
    }
    // Evaluations split across threads may warn from several at once: the
    // sink sees one report at a time (recursive, for a sink that reports).
    static std::recursive_mutex oCallMutex;
    std::lock_guard<std::recursive_mutex> oCallLock(oCallMutex);
    if (oSink) {
        oSink(sReport);
    } else {
        DefaultSink(sReport);
    }
}

std::string SafeText(const char* pszText) {
    return pszText ? std::string(pszText) : std::string();
}

std::string VFormat(const char* pszFormat, va_list args) {
    if (!pszFormat) return std::string();
    va_list argsCopy;
    va_copy(argsCopy, args);
    std::array<char, 256> achSmall{};
    const int nLen = std::vsnprintf(achSmall.data(), achSmall.size(), pszFormat, argsCopy);
    va_end(argsCopy);
    if (nLen < 0) return std::string();
    if (static_cast<std::size_t>(nLen) < achSmall.size()) return std::string(achSmall.data());
    std::string osOut(static_cast<std::size_t>(nLen) + 1, '\0');
    std::vsnprintf(&osOut[0], osOut.size(), pszFormat, args);
    osOut.resize(static_cast<std::size_t>(nLen));
    return osOut;
}

// ---------------------------------------------------------------------------
// Debug log
// ---------------------------------------------------------------------------

std::mutex& DebugMutex() {
    static std::mutex oMutex;
    return oMutex;
}

nova::diag::Debugger::Sink& DebugSink() {
    static nova::diag::Debugger::Sink oSink;
    return oSink;
}

// Copies the first `width` characters (stopping early at a terminator) and
// skips leading blanks.
std::string FieldText(const char* pszField, int nWidth) {
    if (!pszField || nWidth <= 0) return std::string();
    std::string osText;
    osText.reserve(static_cast<std::size_t>(nWidth));
    for (int i = 0; i < nWidth && pszField[i] != '\0'; ++i) osText.push_back(pszField[i]);
    const auto nStart = osText.find_first_not_of(" \t");
    return nStart == std::string::npos ? std::string() : osText.substr(nStart);
}

}  // namespace

// ---------------------------------------------------------------------------
// Memory
// ---------------------------------------------------------------------------

void* HMalloc(std::uint64_t size) {
    void* pBlock = std::malloc(CheckedSize(size));
    if (!pBlock) ThrowOutOfMemory(size);
    return pBlock;
}

void* HCalloc(std::uint64_t count, std::uint64_t size) {
    if (size != 0 && count > kMaxAllocation / size) ThrowOutOfMemory(count * size);
    const std::uint64_t nTotal = count * size;
    void* pBlock = std::calloc(CheckedSize(nTotal), 1);
    if (!pBlock) ThrowOutOfMemory(nTotal);
    return pBlock;
}

void* HRealloc(void* block, std::uint64_t size) {
    void* pBlock = std::realloc(block, CheckedSize(size));
    // On failure the old block is still valid and still the caller's.
    if (!pBlock) ThrowOutOfMemory(size);
    return pBlock;
}

void nova::FreeDeleter::operator()(void* p) const noexcept {
    std::free(p);
}

// ---------------------------------------------------------------------------
// Numbered errors
// ---------------------------------------------------------------------------

void IMPError(int code, int fatal, const char* text) {
    Report(code, fatal, SafeText(text));
}

void IMPErrChar(int code, int fatal, const char* label, const char* value) {
    Report(code, fatal, SafeText(label) + " = \"" + SafeText(value) + "\"");
}

void IMPErrReal(int code, int fatal, const char* label, double value, int number) {
    Report(code, fatal, nova::FormatString("%s = %.17g (%d)", label ? label : "", value, number));
}

void IMPErrMsg(int code, int fatal) {
    Report(code, fatal, std::string());
}

namespace nova {

void RaiseNumbered(int code, const char* text) {
    ReportFatal(code, SafeText(text));
}

}  // namespace nova

const char* _(const char* text) {
    return text;
}

const char* MkName(const char* format, ...) {
    constexpr std::size_t kRing = 16;
    thread_local std::array<std::string, kRing> asRing;
    thread_local std::size_t nNext = 0;
    va_list args;
    va_start(args, format);
    std::string& osSlot = asRing[nNext];
    osSlot = VFormat(format, args);
    va_end(args);
    nNext = (nNext + 1) % kRing;
    return osSlot.c_str();
}

int ScanInt(const char* field, int width) {
    const std::string osText = FieldText(field, width);
    if (osText.empty()) return 0;
    errno = 0;
    char* pszEnd = nullptr;
    const long long nValue = std::strtoll(osText.c_str(), &pszEnd, 10);
    if (pszEnd == osText.c_str()) return 0;
    if (nValue > std::numeric_limits<int>::max()) return std::numeric_limits<int>::max();
    if (nValue < std::numeric_limits<int>::min()) return std::numeric_limits<int>::min();
    return static_cast<int>(nValue);
}

double ScanDouble(const char* field, int width) {
    std::string osText = FieldText(field, width);
    if (osText.empty()) return 0.0;
    for (char& ch : osText) {
        if (ch == 'D' || ch == 'd') ch = 'E';
    }
    char* pszEnd = nullptr;
    const double dfValue = std::strtod(osText.c_str(), &pszEnd);
    if (pszEnd == osText.c_str()) return 0.0;
    return dfValue;
}

// ---------------------------------------------------------------------------
// Vectors and matrices
// ---------------------------------------------------------------------------

double VecLength(const double* v) {
    return std::sqrt(v[0] * v[0] + v[1] * v[1] + v[2] * v[2]);
}

void VecNormalize(double* v) {
    const double dfLen = VecLength(v);
    if (dfLen > 0.0 && std::isfinite(dfLen)) {
        v[0] /= dfLen;
        v[1] /= dfLen;
        v[2] /= dfLen;
    }
}

void VecScale(double s, const double* v, double* out) {
    out[0] = s * v[0];
    out[1] = s * v[1];
    out[2] = s * v[2];
}

void VecDiff(const double* a, const double* b, double* out) {
    out[0] = a[0] - b[0];
    out[1] = a[1] - b[1];
    out[2] = a[2] - b[2];
}

double DotProduct(const double* a, const double* b) {
    return a[0] * b[0] + a[1] * b[1] + a[2] * b[2];
}

void CrossProduct(const double* a, const double* b, double* out) {
    const double adfResult[3] = {a[1] * b[2] - a[2] * b[1], a[2] * b[0] - a[0] * b[2],
                                 a[0] * b[1] - a[1] * b[0]};
    std::memcpy(out, adfResult, sizeof(adfResult));
}

void MV3_Mult(const double* m, const double* v, double* out) {
    double adfResult[3];
    for (int i = 0; i < 3; ++i)
        adfResult[i] = m[3 * i] * v[0] + m[3 * i + 1] * v[1] + m[3 * i + 2] * v[2];
    std::memcpy(out, adfResult, sizeof(adfResult));
}

void MtV3_Mult(const double* m, const double* v, double* out) {
    double adfResult[3];
    for (int i = 0; i < 3; ++i) adfResult[i] = m[i] * v[0] + m[3 + i] * v[1] + m[6 + i] * v[2];
    std::memcpy(out, adfResult, sizeof(adfResult));
}

void MM3_Mult(const double* a, const double* b, double* out) {
    double adfResult[9];
    for (int i = 0; i < 3; ++i) {
        for (int j = 0; j < 3; ++j) {
            adfResult[3 * i + j] =
                a[3 * i] * b[j] + a[3 * i + 1] * b[3 + j] + a[3 * i + 2] * b[6 + j];
        }
    }
    std::memcpy(out, adfResult, sizeof(adfResult));
}

double polyval(const double* coefficients, int degree, double x) {
    if (!coefficients || degree < 0) return 0.0;
    double dfValue = coefficients[0];
    for (int i = 1; i <= degree; ++i) dfValue = dfValue * x + coefficients[i];
    return dfValue;
}

namespace nova {

std::string FormatString(const char* format, ...) {
    va_list args;
    va_start(args, format);
    std::string osOut = VFormat(format, args);
    va_end(args);
    return osOut;
}

// ---------------------------------------------------------------------------
// Exceptions
// ---------------------------------------------------------------------------

Exception::Exception(std::string message, std::string file, std::string function, int line)
    : mosMessage(std::move(message)),
      mosFile(std::move(file)),
      mosFunction(std::move(function)),
      mnLine(line) {}

ParameterException::ParameterException(std::string name, int type, std::string text1,
                                       std::string text2, std::string message, std::string file,
                                       std::string function, int line)
    : DataException(std::move(message), std::move(file), std::move(function), line),
      mosName(std::move(name)),
      mnType(type),
      mosText1(std::move(text1)),
      mosText2(std::move(text2)) {}

NumberedError::NumberedError(int code, std::string message)
    : Exception(std::move(message), "host/src/runtime.cpp", "numbered error report", 0),
      mnCode(code) {}

OutOfMemoryException::OutOfMemoryException(std::uint64_t requested)
    : Exception(FormatString("Out of memory: cannot allocate %llu bytes",
                             static_cast<unsigned long long>(requested)),
                "host/src/runtime.cpp", "host allocator", 0),
      mnRequested(requested) {}

// ---------------------------------------------------------------------------
// Error sink and counters
// ---------------------------------------------------------------------------

ErrorSink SetErrorSink(ErrorSink sink) {
    std::lock_guard<std::mutex> oLock(SinkMutex());
    ErrorSink oOld = std::move(CurrentSink());
    CurrentSink() = std::move(sink);
    return oOld;
}

const char* ErrorCatalogueText(int code) {
    for (const auto& sEntry : kCatalogue) {
        if (sEntry.nCode == code) return sEntry.pszText;
    }
    return "Unknown error";
}

std::uint64_t GetWarningCount() {
    return gnWarnings.load();
}
void ResetWarningCount() {
    gnWarnings = 0;
}
ErrorReport GetLastErrorReport() {
    return tsLastReport;
}

// ---------------------------------------------------------------------------
// Debug log
// ---------------------------------------------------------------------------

namespace diag {

std::atomic<int> Debugger::moDebugLevel{0};

void Debugger::Debug(const std::string& message, int level, const char* module, const char* file,
                     int line) {
    if (moDebugLevel.load() == 0 || level > moDebugLevel.load()) return;
    DebugRecord sRecord{message, level, module ? module : "", file ? file : "", line};
    Sink oSink;
    {
        std::lock_guard<std::mutex> oLock(DebugMutex());
        oSink = DebugSink();
    }
    if (oSink) {
        oSink(sRecord);
        return;
    }
    std::lock_guard<std::mutex> oLock(DebugMutex());
    std::cerr << '[' << sRecord.osModule << "] " << sRecord.osFile << ':' << sRecord.nLine << ": "
              << sRecord.osMessage << '\n';
}

Debugger::Sink Debugger::SetSink(Sink sink) {
    std::lock_guard<std::mutex> oLock(DebugMutex());
    Sink oOld = std::move(DebugSink());
    DebugSink() = std::move(sink);
    return oOld;
}

}  // namespace diag
}  // namespace nova
