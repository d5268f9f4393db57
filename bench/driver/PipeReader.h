#pragma once

#include "orvautil/FileDescriptor.h"

#include <string>
#include <thread>

namespace orva::bench {

/// A named pipe whose bytes a thread reads and discards. Failures are thrown as std::system_error.
class PipeReader {
public:
  /// Creates the pipe at `path`, or replaces what is there. Opening it for writing does not block.
  explicit PipeReader(std::string path);
  PipeReader(const PipeReader&) = delete;
  PipeReader& operator=(const PipeReader&) = delete;
  /// Waits until every program that has the pipe open for writing has ended.
  ~PipeReader();

private:
  std::string path_;
  util::FileDescriptor reader_;
  util::FileDescriptor writer_; ///< keeps the pipe from ending before a program has opened it
  std::jthread thread_;
};

} // namespace orva::bench
