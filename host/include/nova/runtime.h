// Runtime services of the host: allocation, numbered errors, message catalogue,
// fixed-width text scanning, debug log, exceptions, mutex and small 3-D algebra.
#pragma once

#include <atomic>
#include <cstdint>
#include <exception>
#include <functional>
#include <mutex>
#include <string>

#if defined(__GNUC__)
#define NOVA_PRINTF_FORMAT(fmt, first) __attribute__((format(printf, fmt, first)))
#else
#define NOVA_PRINTF_FORMAT(fmt, first)
#endif

// ---------------------------------------------------------------------------
// Memory. Every block is released with the standard free(). None of these
// returns null: exhaustion (or a size that cannot be represented) throws
// nova::OutOfMemoryException.
// ---------------------------------------------------------------------------
void* HMalloc(std::uint64_t size);
void* HCalloc(std::uint64_t count, std::uint64_t size);
void* HRealloc(void* block, std::uint64_t size);

// ---------------------------------------------------------------------------
// Numbered errors. A fatal report (fatal != 0) throws nova::NumberedError and
// does not return; a warning goes to the error sink and returns.
// ---------------------------------------------------------------------------
void IMPError(int code, int fatal, const char* text);
void IMPErrChar(int code, int fatal, const char* label, const char* value);
void IMPErrReal(int code, int fatal, const char* label, double value, int number);
void IMPErrMsg(int code, int fatal);

namespace nova {

// The message numbers of the catalogue, named once for the host services and
// the libraries beside them. A number names a kind of failure; the detail
// text of each report says which value was wrong.
enum MessageNumber : int {
    kMsgInvalidInput = 11,        // invalid or inconsistent input (a bad field, an exceeded limit)
    kMsgUnsupportedSensor = 19,   // unsupported satellite sensor
    kMsgUnsupportedUnit = 32,     // unsupported ground unit or earth model
    kMsgComputationFailed = 100,  // a computation failed (singular system, bad geometry, ...)
    kMsgImageRange = 189,         // image coordinate out of range
};

// A fatal numbered error: reported like IMPError(code, 1, text), it throws
// nova::NumberedError and never returns.
[[noreturn]] void RaiseNumbered(int code, const char* text);

}  // namespace nova

// Message-catalogue translation of a literal; the text itself when there is
// none. The result stays valid for the life of the process or of `text`.
const char* _(const char* text);  // NOLINT(bugprone-reserved-identifier)

// printf-style formatting into text owned by the service (a per-thread ring
// of buffers); valid until the same thread has made 16 more names.
const char* MkName(const char* format, ...) NOVA_PRINTF_FORMAT(1, 2);

// Numbers from the first `width` characters at `field`: leading blanks are
// skipped and the field need not be terminated. An empty or malformed field
// reads as 0; an integer out of range saturates. Fortran 'D' exponents are
// accepted by ScanDouble.
int ScanInt(const char* field, int width);
double ScanDouble(const char* field, int width);

// ---------------------------------------------------------------------------
// Three-vectors (3 doubles) and 3x3 matrices (9 doubles, row by row). The
// output may be the same array as an input.
// ---------------------------------------------------------------------------
void VecNormalize(double* v);  // a zero vector is left unchanged
double VecLength(const double* v);
void VecScale(double s, const double* v, double* out);
void VecDiff(const double* a, const double* b, double* out);
double DotProduct(const double* a, const double* b);
void CrossProduct(const double* a, const double* b, double* out);
void MV3_Mult(const double* m, const double* v, double* out);
void MtV3_Mult(const double* m, const double* v, double* out);
void MM3_Mult(const double* a, const double* b, double* out);

// Polynomial of the given degree, coefficients highest power first.
double polyval(const double* coefficients, int degree, double x);

namespace nova {

// printf-style formatting into a string.
std::string FormatString(const char* format, ...) NOVA_PRINTF_FORMAT(1, 2);

// ---------------------------------------------------------------------------
// Exceptions
// ---------------------------------------------------------------------------
class Exception : public std::exception {
  public:
    Exception(std::string message, std::string file, std::string function, int line);
    const char* what() const noexcept override { return mosMessage.c_str(); }
    const std::string& GetMessage() const { return mosMessage; }
    const std::string& GetFile() const { return mosFile; }
    const std::string& GetFunction() const { return mosFunction; }
    int GetLine() const { return mnLine; }

  private:
    std::string mosMessage;
    std::string mosFile;
    std::string mosFunction;
    int mnLine;
};

class DataException : public Exception {
  public:
    using Exception::Exception;
};

class ParameterException : public DataException {
  public:
    ParameterException(std::string name, int type, std::string text1, std::string text2,
                       std::string message, std::string file, std::string function, int line);
    const std::string& GetParameterName() const { return mosName; }
    int GetParameterType() const { return mnType; }
    const std::string& GetText1() const { return mosText1; }
    const std::string& GetText2() const { return mosText2; }

  private:
    std::string mosName;
    int mnType;
    std::string mosText1;
    std::string mosText2;
};

// Thrown by a fatal numbered error report; carries the number and the full text.
class NumberedError : public Exception {
  public:
    NumberedError(int code, std::string message);
    int GetCode() const { return mnCode; }

  private:
    int mnCode;
};

// Thrown when an allocation cannot be satisfied.
class OutOfMemoryException : public Exception {
  public:
    explicit OutOfMemoryException(std::uint64_t requested);
    std::uint64_t GetRequestedSize() const { return mnRequested; }

  private:
    std::uint64_t mnRequested;
};

// ---------------------------------------------------------------------------
// Error reports: the catalogue, the sink for warnings, and counters.
// ---------------------------------------------------------------------------
struct ErrorReport {
    int nCode;
    bool bFatal;
    std::string osText;  // complete text as shown to the user
};

using ErrorSink = std::function<void(const ErrorReport&)>;

// Replaces the warning sink (null restores the default, standard error) and
// returns the previous one. Fatal reports are thrown, not sent to the sink.
// The sink may be called from the worker threads of an evaluation, but never
// by two threads at once.
ErrorSink SetErrorSink(ErrorSink sink);
// Catalogue wording of a message number ("Unknown error" for others).
const char* ErrorCatalogueText(int code);
// Number of warnings (non-fatal reports) since start or the last reset.
std::uint64_t GetWarningCount();
void ResetWarningCount();
// The last report of this thread, fatal or not (code 0 when none yet).
ErrorReport GetLastErrorReport();

namespace diag {

struct DebugRecord {
    std::string osMessage;
    int nLevel;
    std::string osModule;
    std::string osFile;
    int nLine;
};

class Debugger {
  public:
    using Sink = std::function<void(const DebugRecord&)>;

    // Current debug level; 0 turns logging off. Callers test it before they
    // format anything.
    static std::atomic<int> moDebugLevel;

    static unsigned GetDebugLevel() { return static_cast<unsigned>(moDebugLevel.load()); }
    static void SetDebugLevel(int level) { moDebugLevel = level; }
    // Records one message when `level` is not above the current level.
    static void Debug(const std::string& message, int level, const char* module, const char* file,
                      int line);
    // Replaces the sink (null restores standard error) and returns the old one.
    static Sink SetSink(Sink sink);
};

}  // namespace diag

namespace threading {

class Mutex {
  public:
    Mutex() = default;
    Mutex(const Mutex&) = delete;
    Mutex& operator=(const Mutex&) = delete;
    void Lock() { moMutex.lock(); }
    void Unlock() { moMutex.unlock(); }
    bool TryLock() { return moMutex.try_lock(); }
    // BasicLockable, so std::lock_guard works on it.
    void lock() { Lock(); }
    void unlock() { Unlock(); }

  private:
    std::mutex moMutex;
};

}  // namespace threading
}  // namespace nova

// RAII owner for blocks from the host allocator.
namespace nova {
struct FreeDeleter {
    void operator()(void* p) const noexcept;
};
}  // namespace nova
