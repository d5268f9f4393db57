#include "service/StatusFile.h"

#include "service/Log.h"

#include <nlohmann/json.hpp>

#include <cerrno>
#include <cstdio>
#include <fstream>
#include <system_error>
#include <utility>

namespace orva::service {

std::optional<StatusFile::Clock::time_point>
StatusFile::Update(const nlohmann::ordered_json& volumes, bool isBusy, Clock::time_point now) {
  using Json = nlohmann::ordered_json;
  // A mount point may contain any bytes. Those that are not UTF-8 become U+FFFD.
  std::string text =
      Json{{"volumes", volumes}}.dump(-1, ' ', false, Json::error_handler_t::replace) + '\n';
  if (text == text_) {
    return std::nullopt;
  }
  constexpr std::chrono::seconds INTERVAL(1);
  if (!text_.empty() && isBusy && now < writtenAt_ + INTERVAL) {
    return writtenAt_ + INTERVAL;
  }
  const bool isWritten = Write(text);
  const int error = errno;
  if (!isWritten && !hasFailed_) {
    LogError("Cannot write " + path_ + ": " + std::generic_category().message(error));
  }
  hasFailed_ = !isWritten;
  if (isWritten) {
    text_ = std::move(text);
    writtenAt_ = now;
  }
  return std::nullopt;
}

/// Sets errno when that fails.
bool StatusFile::Write(const std::string& text) const {
  const std::string temporary = path_ + ".new";
  std::ofstream file(temporary, std::ios::trunc | std::ios::binary);
  file << text;
  file.close();
  return file && std::rename(temporary.c_str(), path_.c_str()) == 0;
}

} // namespace orva::service
