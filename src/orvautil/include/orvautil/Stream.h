#pragma once

namespace orva::util {

/// A stream of bytes in both directions. Used by one thread at a time.
class Stream {
public:
  Stream() = default;
  Stream(const Stream&) = delete;
  Stream& operator=(const Stream&) = delete;
  virtual ~Stream() = default;

  virtual bool IsOpen() const = 0;

  /// Ends the stream; harmless when it has ended.
  virtual void Close() = 0;

  /// Sends buffered data.
  virtual void Flush() = 0;

  /// True when a Read would not block; then `*count` (if not null) is the number of bytes that
  /// can be read, 0 at the end of the stream.
  virtual bool IsDataAvailable(unsigned long long* count) = 0;

  /// Waits for data and reads up to `size` bytes. Returns their number; 0 at the end of the
  /// stream, and also when the peer vanished or the read failed.
  virtual unsigned Read(void* data, unsigned size) = 0;

  /// Writes `size` bytes. Returns the number written; less than `size` when the stream ended.
  virtual unsigned Write(const void* data, unsigned size) = 0;
};

} // namespace orva::util
