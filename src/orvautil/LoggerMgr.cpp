#include "orvautil/LoggerMgr.h"

#include "orvautil/FormatString.h"

#include <cstdarg>
#include <utility>

namespace orva::util {

void LoggerMgr::AddLogger(unsigned level, Logger logger) {
  loggers_.push_back(std::move(logger));
  level_ = level;
}

void LoggerMgr::Log(unsigned level, const char* file, unsigned line, const char* format,
                    ...) const {
  if (level > level_) {
    return;
  }
  std::va_list arguments;
  va_start(arguments, format);
  const std::string message =
      FormatString("%s:%u: ", file, line) + FormatStringV(format, arguments);
  va_end(arguments);
  for (const auto& logger : loggers_) {
    logger(message);
  }
}

} // namespace orva::util
