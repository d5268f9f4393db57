#include "StatusFile.h"

#include "Log.h"

#include <nlohmann/json.hpp>

#include <syslog.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <fstream>
#include <system_error>

namespace orva::transcoder {

std::optional<StatusFile::Clock::time_point>
StatusFile::Update(const std::vector<VolumeStatus>& volumes) {
  if (volumes == written_) {
    return std::nullopt;
  }
  constexpr std::chrono::seconds INTERVAL(1);
  const bool isIdle = std::ranges::none_of(volumes, &VolumeStatus::isRendering);
  const auto now = Clock::now();
  if (written_ && !isIdle && now < writtenAt_ + INTERVAL) {
    return writtenAt_ + INTERVAL;
  }
  Write(volumes);
  written_ = volumes;
  writtenAt_ = now;
  return std::nullopt;
}

void StatusFile::Write(const std::vector<VolumeStatus>& volumes) const {
  using Json = nlohmann::ordered_json;
  Json list = Json::array();
  for (const VolumeStatus& volume : volumes) {
    list.push_back({{"mountPoint", volume.mountPoint},
                    {"waiting", volume.waiting},
                    {"failed", volume.failed},
                    {"rendering", volume.isRendering}});
  }
  const std::string temporary = path_ + ".new";
  // A mount point may contain any bytes.
  std::ofstream(temporary) << Json{{"volumes", list}}.dump(-1, ' ', false,
                                                           Json::error_handler_t::replace)
                           << '\n';
  if (std::rename(temporary.c_str(), path_.c_str()) != 0) {
    Log(LOG_ERR, path_ + ": " + std::generic_category().message(errno));
  }
}

} // namespace orva::transcoder
