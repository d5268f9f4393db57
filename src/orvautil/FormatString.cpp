#include "orvautil/FormatString.h"

#include "orvautil/Exception.h"

#include <cstddef>
#include <cstdio>

namespace orva::util {

std::string FormatString(const char* format, ...) {
  std::va_list arguments;
  va_start(arguments, format);
  std::string text = FormatStringV(format, arguments);
  va_end(arguments);
  return text;
}

std::string FormatStringV(const char* format, std::va_list arguments) {
  std::va_list measured;
  va_copy(measured, arguments);
  const int length = std::vsnprintf(nullptr, 0, format, measured);
  va_end(measured);
  if (length < 0) {
    throw Exception("Cannot format a message");
  }
  std::string text(static_cast<std::size_t>(length), '\0');
  std::vsnprintf(text.data(), text.size() + 1, format, arguments);
  return text;
}

} // namespace orva::util
