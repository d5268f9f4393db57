#pragma once

#include "StandardOutput.h"

#include "orvautil/FileDescriptor.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <string>

namespace orva::test {

/// Standard output as a file for a scope.
class CapturedOutput {
public:
  CapturedOutput() { dup2(file_.Get(), STDOUT_FILENO); }
  CapturedOutput(const CapturedOutput&) = delete;
  CapturedOutput& operator=(const CapturedOutput&) = delete;
  ~CapturedOutput() {
    dbmerger::StandardOutput::Current().Flush(); // what a failure has left
    dup2(original_.Get(), STDOUT_FILENO);
  }

  /// What was written so far.
  std::string Take() const {
    std::string text;
    std::array<char, 65536> bytes{};
    ssize_t count = 0;
    while ((count = pread(file_.Get(), bytes.data(), bytes.size(),
                          static_cast<off_t>(text.size()))) > 0) {
      text.append(bytes.data(), static_cast<std::size_t>(count));
    }
    return text;
  }

private:
  util::FileDescriptor original_{dup(STDOUT_FILENO)};
  util::FileDescriptor file_{open("/tmp/captured", O_RDWR | O_CREAT | O_TRUNC | O_APPEND, 0600)};
};

} // namespace orva::test
