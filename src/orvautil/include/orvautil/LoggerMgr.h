#pragma once

#include <functional>
#include <string>
#include <vector>

namespace orva::util {

/// The process's logging manager. Nothing is logged until a logger is added. Reached through
/// Singleton<LoggerMgr>; the manager itself is not locked: add loggers before other threads log.
class LoggerMgr {
public:
  using Logger = std::function<void(const std::string&)>;

  /// Messages up to this level are logged; 0 (none) until a logger is added.
  unsigned Level() const noexcept { return level_; }

  /// Adds a logger, which is handed each finished message, and sets the level.
  void AddLogger(unsigned level, Logger logger);

  /// Formats a message as printf does and hands "file:line: message" to every logger when
  /// `level` is not above Level().
  void Log(unsigned level, const char* file, unsigned line, const char* format, ...) const
      __attribute__((format(printf, 5, 6)));

private:
  unsigned level_ = 0;
  std::vector<Logger> loggers_;
};

} // namespace orva::util
