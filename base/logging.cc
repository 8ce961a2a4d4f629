#include "base/logging.h"

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <string>

#if defined(__ANDROID__) || defined(SORVEL_ANDROID_LOG)
#include <android/log.h>
#define SORVEL_USE_ANDROID_LOG 1
#endif

namespace sorvel_base {
namespace {

std::atomic<LogSink*> g_sink{nullptr};
std::atomic<int> g_vlog_level{0};

#ifdef SORVEL_USE_ANDROID_LOG
int AndroidPriority(LogSeverity severity) {
  switch (severity) {
    case INFO:
      return ANDROID_LOG_INFO;
    case WARNING:
      return ANDROID_LOG_WARN;
    case ERROR:
      return ANDROID_LOG_ERROR;
    case FATAL:
      return ANDROID_LOG_FATAL;
  }
  return ANDROID_LOG_INFO;
}
#endif

}  // namespace

const char* LogSeverityName(LogSeverity severity) {
  switch (severity) {
    case INFO:
      return "INFO";
    case WARNING:
      return "WARNING";
    case ERROR:
      return "ERROR";
    case FATAL:
      return "FATAL";
  }
  return "UNKNOWN";
}

LogSink* SetLogSink(LogSink* sink) { return g_sink.exchange(sink); }

void SendToDefaultSink(LogSeverity severity, const char* file, int line,
                       std::string_view message) {
  // One formatted string per line, written in one call, so that lines from
  // different threads do not interleave.
  std::string text;
  text.reserve(message.size() + 64);
  text += file;
  text += ':';
  text += std::to_string(line);
  text += "] ";
  text += message;
#ifdef SORVEL_USE_ANDROID_LOG
  __android_log_write(AndroidPriority(severity), "Sorvel", text.c_str());
#else
  std::string stderr_line = std::string(1, LogSeverityName(severity)[0]) + " " +
                            text + "\n";
  std::fwrite(stderr_line.data(), 1, stderr_line.size(), stderr);
  std::fflush(stderr);
#endif
}

void SetVlogLevel(int level) { g_vlog_level.store(level); }

int GetVlogLevel() { return g_vlog_level.load(std::memory_order_relaxed); }

namespace internal {

LogMessage::LogMessage(const char* file, int line, LogSeverity severity)
    : file_(file), line_(line), severity_(severity) {}

LogMessage::~LogMessage() { Flush(); }

void LogMessage::Flush() {
  const std::string message = stream_.str();
  if (LogSink* sink = g_sink.load(); sink != nullptr) {
    sink->Send(severity_, file_, line_, message);
  } else {
    SendToDefaultSink(severity_, file_, line_, message);
  }
}

LogMessageFatal::LogMessageFatal(const char* file, int line)
    : LogMessage(file, line, FATAL) {}

LogMessageFatal::~LogMessageFatal() {
  Flush();
  // A capturing sink may have swallowed the line; the default sink always
  // records why the process ends.
  if (g_sink.load() != nullptr) {
    SendToDefaultSink(FATAL, file_, line_, stream_.str());
  }
  std::abort();
}

}  // namespace internal
}  // namespace sorvel_base
