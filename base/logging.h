// Logging and fatal checks for the Sorvel library.
//
//   LOG(INFO|WARNING|ERROR|FATAL) << ...;   one line per statement
//   VLOG(n) << ...;                         only when n <= GetVlogLevel()
//   CHECK(cond) << ...;                     logs "Check failed: cond" and aborts
//   CHECK_EQ/NE/LT/LE/GT/GE(a, b)           same, and prints both values
//   DCHECK(cond)                            CHECK in debug builds, nothing in NDEBUG
//
// Lines go to standard error on the host and to the Android log (tag "Sorvel")
// on Android. The verbosity is 0 (VLOG off) until SetVlogLevel raises it; the
// library never reads it from the environment. A process may install its own
// sink (SetLogSink), which tests use to capture messages.
//
// Thread safety: the sink pointer and the verbosity are atomics; a sink must
// itself be safe for concurrent Send calls if the library is used from
// several threads.
#ifndef BASE_LOGGING_H_
#define BASE_LOGGING_H_

#include <sstream>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>

namespace sorvel_base {

enum LogSeverity : int { INFO = 0, WARNING = 1, ERROR = 2, FATAL = 3 };

// "INFO", "WARNING", "ERROR" or "FATAL".
const char* LogSeverityName(LogSeverity severity);

// Receives every log line. `file` is the source path relative to the
// repository root, `message` the text without prefix or newline.
class LogSink {
 public:
  virtual ~LogSink() = default;
  virtual void Send(LogSeverity severity, const char* file, int line,
                    std::string_view message) = 0;
};

// Installs `sink` (nullptr restores the default sink) and returns the sink
// that was installed before. The caller keeps ownership.
LogSink* SetLogSink(LogSink* sink);

// The default destination: standard error, or the Android log when the
// library is built for Android (or with SORVEL_ANDROID_LOG on the host).
void SendToDefaultSink(LogSeverity severity, const char* file, int line,
                       std::string_view message);

// VLOG(n) statements with n <= level are logged at INFO severity.
void SetVlogLevel(int level);
int GetVlogLevel();
inline bool VlogIsOn(int level) { return level <= GetVlogLevel(); }

namespace internal {

// Collects one line and hands it to the sink when destroyed.
class LogMessage {
 public:
  LogMessage(const char* file, int line, LogSeverity severity);
  ~LogMessage();
  LogMessage(const LogMessage&) = delete;
  LogMessage& operator=(const LogMessage&) = delete;
  std::ostream& stream() { return stream_; }

 protected:
  void Flush();

  const char* file_;
  int line_;
  LogSeverity severity_;
  std::ostringstream stream_;
};

// A FATAL line: sent, then the process aborts.
class LogMessageFatal : public LogMessage {
 public:
  LogMessageFatal(const char* file, int line);
  [[noreturn]] ~LogMessageFatal();
};

// Turns the stream expression of a conditional log statement into void so
// that it can stand in the false branch of ?: (the true branch is (void)0).
struct Voidify {
  void operator&(std::ostream&) {}
};

// Returns nullptr when the comparison holds, else the message text
// "a op b (va vs. vb)".
template <typename A, typename B>
std::string* MakeCheckOpString(const A& a, const B& b, const char* text) {
  std::ostringstream out;
  out << text << " (" << a << " vs. " << b << ")";
  return new std::string(out.str());
}

// Integers of mixed signedness compare by value (std::cmp_*), so that
// CHECK_EQ(v.size(), n) needs no cast and cannot wrap.
template <typename T>
inline constexpr bool kCompareAsInteger =
    std::is_integral_v<T> && !std::is_same_v<T, bool> &&
    !std::is_same_v<T, char>;

#define SORVEL_DEFINE_CHECK_OP(name, op, integer_compare)                   \
  template <typename A, typename B>                                         \
  inline std::string* Check##name##Impl(const A& a, const B& b,             \
                                        const char* text) {                 \
    bool ok;                                                                \
    if constexpr (kCompareAsInteger<A> && kCompareAsInteger<B>) {           \
      ok = integer_compare(a, b);                                           \
    } else {                                                                \
      ok = a op b;                                                          \
    }                                                                       \
    if (ok) [[likely]] return nullptr;                                      \
    return MakeCheckOpString(a, b, text);                                   \
  }
SORVEL_DEFINE_CHECK_OP(EQ, ==, std::cmp_equal)
SORVEL_DEFINE_CHECK_OP(NE, !=, std::cmp_not_equal)
SORVEL_DEFINE_CHECK_OP(LT, <, std::cmp_less)
SORVEL_DEFINE_CHECK_OP(LE, <=, std::cmp_less_equal)
SORVEL_DEFINE_CHECK_OP(GT, >, std::cmp_greater)
SORVEL_DEFINE_CHECK_OP(GE, >=, std::cmp_greater_equal)
#undef SORVEL_DEFINE_CHECK_OP

// Owns the text of a failed CHECK_op until the fatal line is written.
class CheckOpMessage {
 public:
  explicit CheckOpMessage(std::string* text) : text_(text) {}
  ~CheckOpMessage() { delete text_; }
  CheckOpMessage(const CheckOpMessage&) = delete;
  CheckOpMessage& operator=(const CheckOpMessage&) = delete;
  explicit operator bool() const { return text_ != nullptr; }
  const std::string& text() const { return *text_; }

 private:
  std::string* text_;
};

}  // namespace internal
}  // namespace sorvel_base

#define SORVEL_LOG_INFO \
  ::sorvel_base::internal::LogMessage(__FILE__, __LINE__, ::sorvel_base::INFO)
#define SORVEL_LOG_WARNING                              \
  ::sorvel_base::internal::LogMessage(__FILE__, __LINE__, \
                                      ::sorvel_base::WARNING)
#define SORVEL_LOG_ERROR \
  ::sorvel_base::internal::LogMessage(__FILE__, __LINE__, ::sorvel_base::ERROR)
#define SORVEL_LOG_FATAL \
  ::sorvel_base::internal::LogMessageFatal(__FILE__, __LINE__)

#define LOG(severity) SORVEL_LOG_##severity.stream()

#define LOG_IF(severity, condition) \
  !(condition) ? (void)0            \
               : ::sorvel_base::internal::Voidify() & LOG(severity)

#define VLOG(level) LOG_IF(INFO, ::sorvel_base::VlogIsOn(level))

#define CHECK(condition)                                             \
  (condition) ? (void)0                                              \
              : ::sorvel_base::internal::Voidify() &                 \
                    ::sorvel_base::internal::LogMessageFatal(__FILE__, \
                                                             __LINE__) \
                            .stream()                                \
                        << "Check failed: " #condition " "

#define SORVEL_CHECK_OP(name, op, a, b)                                       \
  while (::sorvel_base::internal::CheckOpMessage sorvel_check_message{        \
      ::sorvel_base::internal::Check##name##Impl((a), (b), #a " " #op " " #b)}) \
  ::sorvel_base::internal::LogMessageFatal(__FILE__, __LINE__).stream()       \
      << "Check failed: " << sorvel_check_message.text() << " "

#define CHECK_EQ(a, b) SORVEL_CHECK_OP(EQ, ==, a, b)
#define CHECK_NE(a, b) SORVEL_CHECK_OP(NE, !=, a, b)
#define CHECK_LT(a, b) SORVEL_CHECK_OP(LT, <, a, b)
#define CHECK_LE(a, b) SORVEL_CHECK_OP(LE, <=, a, b)
#define CHECK_GT(a, b) SORVEL_CHECK_OP(GT, >, a, b)
#define CHECK_GE(a, b) SORVEL_CHECK_OP(GE, >=, a, b)

#ifdef NDEBUG
#define DCHECK(condition) \
  while (false) CHECK(condition)
#else
#define DCHECK(condition) CHECK(condition)
#endif

#endif  // BASE_LOGGING_H_
