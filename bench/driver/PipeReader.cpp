#include "PipeReader.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <system_error>
#include <utility>

namespace orva::bench {

namespace {

/// As much as a pipe holds.
constexpr std::size_t CHUNK = 65536;

int Check(int result, const std::string& path) {
  if (result == -1) {
    throw std::system_error(errno, std::generic_category(), path);
  }
  return result;
}

} // namespace

PipeReader::PipeReader(std::string path) : path_(std::move(path)) {
  unlink(path_.c_str());
  Check(mkfifo(path_.c_str(), 0600), path_);
  // A blocking open would wait for the other end.
  reader_.Reset(Check(open(path_.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC), path_));
  writer_.Reset(Check(open(path_.c_str(), O_WRONLY | O_CLOEXEC), path_));
  Check(fcntl(reader_.Get(), F_SETFL, O_RDONLY), path_);
  thread_ = std::jthread([this] {
    std::array<char, CHUNK> bytes;
    while (read(reader_.Get(), bytes.data(), bytes.size()) > 0) {
    }
  });
}

PipeReader::~PipeReader() {
  writer_.Reset();
  thread_.join();
  unlink(path_.c_str());
}

} // namespace orva::bench
