// Validation of settings records: one function per record says whether an
// object can be built from it. Constructors end the process on a refused
// record (CHECK_VALID), as a fatal check would; tools and language bindings
// call the same function first and show its message instead.
//
//   sorvel_base::Validation ValidateFooParams(const FooParams& params) {
//     SORVEL_REQUIRE(params.size > 0, "size must be positive, got ", params.size);
//     return {};
//   }
//   Foo::Foo(const FooParams& params) { CHECK_VALID(ValidateFooParams(params)); }
//
// A refused record names the first condition that failed, as written in the
// validator, so the fatal line reads "Check failed: params.size > 0 (size
// must be positive, got 0)" with the validator's file and line.
#ifndef BASE_VALIDATION_H_
#define BASE_VALIDATION_H_

#include <sstream>
#include <string>
#include <utility>

#include "base/logging.h"

namespace sorvel_base {

// The parts written one after another, as an ostream would.
template <typename... Parts>
std::string StrCat(const Parts&... parts) {
  std::ostringstream out;
  (out << ... << parts);
  return out.str();
}

class Validation {
 public:
  // Usable.
  Validation() = default;

  static Validation Failed(const char* condition, const char* file, int line,
                           std::string message) {
    Validation v;
    v.condition_ = condition;
    v.file_ = file;
    v.line_ = line;
    v.message_ = std::move(message);
    return v;
  }

  bool ok() const { return condition_ == nullptr; }
  // The failed condition's source text; "" when usable.
  const char* condition() const { return ok() ? "" : condition_; }
  // A sentence for people naming the setting, what it may be and what it
  // was; "" when usable.
  const std::string& message() const { return message_; }
  const char* file() const { return file_; }
  int line() const { return line_; }

 private:
  const char* condition_ = nullptr;
  const char* file_ = "";
  int line_ = 0;
  std::string message_;
};

namespace internal {

inline void CheckValid(const Validation& validation) {
  if (validation.ok()) [[likely]] return;
  LogMessageFatal(validation.file(), validation.line()).stream()
      << "Check failed: " << validation.condition() << " (" << validation.message() << ")";
}

}  // namespace internal
}  // namespace sorvel_base

// Inside a validator: refuses the record unless `condition` holds.
#define SORVEL_REQUIRE(condition, ...) \
  SORVEL_REQUIRE_AS(condition, #condition, __VA_ARGS__)

// Same, printing `text` as the condition (for conditions whose established
// text is not valid C++ as written).
#define SORVEL_REQUIRE_AS(condition, text, ...)                                 \
  do {                                                                          \
    if (!(condition)) {                                                         \
      return ::sorvel_base::Validation::Failed(text, __FILE__, __LINE__,       \
                                               ::sorvel_base::StrCat(__VA_ARGS__)); \
    }                                                                           \
  } while (false)

// Inside a validator: passes on the refusal of a nested record's validator.
#define SORVEL_RETURN_IF_INVALID(validation)                              \
  do {                                                                    \
    if (::sorvel_base::Validation sorvel_nested = (validation); !sorvel_nested.ok()) { \
      return sorvel_nested;                                               \
    }                                                                     \
  } while (false)

// Ends the process when the validation refused the record.
#define CHECK_VALID(validation) ::sorvel_base::internal::CheckValid(validation)

#endif  // BASE_VALIDATION_H_
