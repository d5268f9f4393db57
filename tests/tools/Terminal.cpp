#include "Terminal.h"

#include "system/Deadline.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <cstdlib>
#include <stdexcept>
#include <utility>

namespace orva::test {

Terminal::Terminal(int columns, int rows) : master_(posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC)) {
  const winsize size{.ws_row = static_cast<unsigned short>(rows),
                     .ws_col = static_cast<unsigned short>(columns),
                     .ws_xpixel = 0,
                     .ws_ypixel = 0};
  if (!master_ || grantpt(master_.Get()) != 0 || unlockpt(master_.Get()) != 0 ||
      ioctl(master_.Get(), TIOCSWINSZ, &size) != 0) {
    throw std::runtime_error("no pseudo terminal");
  }
}

Lines Terminal::Run(const Arguments& arguments) const {
  const auto program = Start(arguments);
  std::string text;
  while (Read(text)) {
  }
  program->WaitForEnd();
  return SplitLines(text);
}

std::unique_ptr<Program> Terminal::Start(const Arguments& arguments) const {
  return std::make_unique<Program>(ZophotosCommand(arguments),
                                   Program::Options{.output = ptsname(master_.Get())});
}

std::string Terminal::ReadTo(const std::string& end) {
  while (rest_.find(end) == std::string::npos && Read(rest_)) {
  }
  const std::size_t found = rest_.find(end);
  if (found == std::string::npos) {
    return std::exchange(rest_, "");
  }
  std::string text = rest_.substr(0, found + end.size());
  rest_.erase(0, text.size());
  return text;
}

bool Terminal::Read(std::string& text) const {
  std::array<char, 4096> chunk{};
  pollfd ready{master_.Get(), POLLIN, 0};
  const auto deadline = std::chrono::milliseconds(DEADLINE).count();
  if (poll(&ready, 1, static_cast<int>(deadline)) != 1) {
    return false;
  }
  const ssize_t size = read(master_.Get(), chunk.data(), chunk.size());
  if (size <= 0) {
    return false;
  }
  text.append(chunk.data(), static_cast<std::size_t>(size));
  std::erase(text, '\r');
  return true;
}

} // namespace orva::test
