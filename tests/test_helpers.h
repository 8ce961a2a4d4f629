// Helpers shared by the unit tests.
#ifndef TESTS_TEST_HELPERS_H_
#define TESTS_TEST_HELPERS_H_

#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "base/logging.h"

namespace sorvel_test {

// A death-test regex that matches "Check failed: <expression>" literally.
inline std::string CheckFailed(std::string_view expression) {
  std::string pattern = "Check failed: ";
  for (char c : expression) {
    if (std::string_view("\\^$.|?*+()[]{}").find(c) != std::string_view::npos) {
      pattern += '\\';
    }
    pattern += c;
  }
  return pattern;
}

// Captures log lines while alive, instead of printing them.
class ScopedLogCapture : public sorvel_base::LogSink {
 public:
  struct Entry {
    sorvel_base::LogSeverity severity;
    std::string file;
    int line;
    std::string message;
  };

  ScopedLogCapture() : previous_(sorvel_base::SetLogSink(this)) {}
  ~ScopedLogCapture() override { sorvel_base::SetLogSink(previous_); }

  void Send(sorvel_base::LogSeverity severity, const char* file, int line,
            std::string_view message) override {
    std::lock_guard<std::mutex> lock(mutex_);
    entries_.push_back({severity, file, line, std::string(message)});
  }

  std::vector<Entry> entries() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return entries_;
  }

  // True when some line at `severity` contains `text`.
  bool Contains(sorvel_base::LogSeverity severity,
                std::string_view text) const {
    for (const Entry& e : entries()) {
      if (e.severity == severity && e.message.find(text) != std::string::npos) {
        return true;
      }
    }
    return false;
  }

 private:
  sorvel_base::LogSink* previous_;
  mutable std::mutex mutex_;
  std::vector<Entry> entries_;
};

}  // namespace sorvel_test

#endif  // TESTS_TEST_HELPERS_H_
