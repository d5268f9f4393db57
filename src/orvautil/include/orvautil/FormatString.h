#pragma once

#include <cstdarg>
#include <string>

namespace orva::util {

/// The text that printf would write. Throws Exception when the format is broken.
std::string FormatString(const char* format, ...) __attribute__((format(printf, 1, 2)));

/// The same with an argument list, whose value is unspecified afterwards, as with vprintf.
std::string FormatStringV(const char* format, std::va_list arguments)
    __attribute__((format(printf, 1, 0)));

} // namespace orva::util
