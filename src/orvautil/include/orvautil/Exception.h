#pragma once

#include <stdexcept>
#include <string>

namespace orva::util {

/// A failure that ends the operation that met it; what() is the message for a person.
class Exception : public std::runtime_error {
public:
  /// `file` and `line` name the place that throws; `file` must outlive the exception
  /// (a string literal, `__FILE__`).
  Exception(const std::string& message, const char* file, unsigned int line)
      : std::runtime_error(message), file_(file), line_(line) {}

  const char* File() const noexcept { return file_; }
  unsigned int Line() const noexcept { return line_; }

private:
  const char* file_;
  unsigned int line_;
};

} // namespace orva::util
