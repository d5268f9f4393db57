#pragma once

#include "orvautil/FileDescriptor.h"

#include <condition_variable>
#include <cstddef>
#include <functional>
#include <mutex>
#include <ostream>
#include <string>
#include <thread>
#include <vector>

namespace orva::test {

/// One syslog message: its priority (facility and level) and its text, line feeds included.
struct LogLine {
  int priority;
  std::string text;

  bool operator==(const LogLine&) const = default;
};

/// "142 text", as a failed assertion shows it.
std::ostream& operator<<(std::ostream& stream, const LogLine& line);

/// A message of LOG_LOCAL1 | LOG_INFO.
LogLine Info(const std::string& text);
/// A message of LOG_LOCAL1 | LOG_ERR.
LogLine Error(const std::string& text);
/// A message of LOG_INFO with no facility.
LogLine Plain(const std::string& text);

/// The system log of a private root: owns /dev/log and keeps what arrives there, in order. A thread
/// of its own reads, so that no program waits for the test.
class Syslog {
public:
  /// Binds /dev/log. Throws std::system_error.
  Syslog();
  Syslog(const Syslog&) = delete;
  Syslog& operator=(const Syslog&) = delete;
  ~Syslog();

  using Condition = std::function<bool(const std::vector<LogLine>&)>;

  /// All messages that were sent before this call, without the `first` ones.
  std::vector<LogLine> Lines(std::size_t first = 0) const;

  /// Waits until `condition` holds for the messages received so far; false after the deadline.
  bool Await(const Condition& condition) const;

  /// Waits for a message with exactly this priority and text.
  bool Await(const LogLine& line) const;

private:
  void Collect();
  std::unique_lock<std::mutex> LockAfterAllSent() const;

  util::FileDescriptor socket_;
  mutable std::mutex mutex_;
  mutable std::condition_variable arrived_;
  std::vector<LogLine> lines_; ///< guarded by mutex_
  int marksSeen_ = 0;          ///< guarded by mutex_
  mutable int marksSent_ = 0;  ///< the caller's thread only
  std::jthread collector_;
};

} // namespace orva::test
