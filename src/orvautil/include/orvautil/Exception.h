#pragma once

#include <stdexcept>
#include <string>

namespace orva::util {

/// An error that ends the current operation; what() is a message for people.
class Exception : public std::runtime_error {
public:
  /// `file` and `line` name the place that throws; `file` must outlive the exception, as a literal
  /// does.
  explicit Exception(const std::string& message, const char* file = __builtin_FILE(),
                     unsigned int line = __builtin_LINE())
      : std::runtime_error(message), file_(file), line_(line) {}

  const char* File() const noexcept { return file_; }
  unsigned int Line() const noexcept { return line_; }

private:
  const char* file_;
  unsigned int line_;
};

} // namespace orva::util
