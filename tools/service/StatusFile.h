#pragma once

#include <nlohmann/json_fwd.hpp>

#include <chrono>
#include <optional>
#include <string>

namespace orva::service {

/// The file in which the indexer and the transcoder tell other programs what they are doing,
/// replaced as a whole. Used by one thread.
class StatusFile {
public:
  using Clock = std::chrono::steady_clock;

  /// The file is `directory`/status.json.
  explicit StatusFile(const std::string& directory) : path_(directory + "/status.json") {}

  /// Writes the file if the status has changed, at most once a second while the service `isBusy`.
  /// `volumes` is an array with an object for each volume. Returns when to call it again if it was
  /// too early. The first of several failures is logged; each call tries again.
  std::optional<Clock::time_point> Update(const nlohmann::ordered_json& volumes, bool isBusy,
                                          Clock::time_point now = Clock::now());

private:
  bool Write(const std::string& text) const;

  const std::string path_;
  std::string text_; ///< as it was last written; empty before
  Clock::time_point writtenAt_;
  bool hasFailed_ = false;
};

} // namespace orva::service
