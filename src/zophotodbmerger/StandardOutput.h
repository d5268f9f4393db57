#pragma once

#include "orvautil/FileDescriptor.h"

#include <sys/types.h>

#include <initializer_list>
#include <string>
#include <string_view>

namespace orva::dbmerger {

/// The lines on standard output. They are collected and written in few calls. A caller flushes
/// before it changes what its lines announce, and before it returns (FlushAtEnd). One thread at a
/// time.
///
/// A line that cannot be written is lost: a closed output is ignored, and a reader that has stopped
/// reading is waited for once and then loses lines until it reads again. It never gets a part of a
/// line without the rest.
class StandardOutput {
public:
  /// The standard output. Finds out what that is if it has changed since the last call.
  static StandardOutput& Current();

  StandardOutput() = default;
  StandardOutput(const StandardOutput&) = delete;
  StandardOutput& operator=(const StandardOutput&) = delete;
  ~StandardOutput() = default;

  /// Whether lines are discarded: the output is the null device, or closed.
  bool IsNull() const noexcept { return kind_ == Kind::Null; }

  /// Adds the pieces and a line feed.
  void WriteLine(std::initializer_list<std::string_view> pieces);

  /// Writes what was collected. Waits at most a second for a reader that has stopped reading.
  void Flush();

private:
  enum class Kind { Null, File, Socket, Datagrams, Stream };

  void Inspect();
  ssize_t Send(std::string_view text) const;
  bool IsWritable(int timeout) const;

  Kind kind_ = Kind::Null;
  dev_t device_ = 0; ///< with the next one tells whether the output has changed
  ino_t inode_ = 0;
  util::FileDescriptor own_; ///< of a Stream; may be empty
  std::string pending_;
  bool isInLine_ = false;  ///< the last byte written was not the end of a line
  bool isStalled_ = false; ///< the reader has stopped reading
};

/// Flushes the output when a scope ends, also by an exception.
class FlushAtEnd {
public:
  explicit FlushAtEnd(StandardOutput& output) : output_(output) {}
  FlushAtEnd(const FlushAtEnd&) = delete;
  FlushAtEnd& operator=(const FlushAtEnd&) = delete;
  ~FlushAtEnd() { output_.Flush(); }

private:
  StandardOutput& output_;
};

} // namespace orva::dbmerger
