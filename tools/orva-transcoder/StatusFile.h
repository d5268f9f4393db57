#pragma once

#include <chrono>
#include <cstddef>
#include <optional>
#include <string>
#include <vector>

namespace orva::transcoder {

/// What is going on at a volume.
struct VolumeStatus {
  std::string mountPoint;
  std::size_t waiting = 0;
  std::size_t failed = 0;
  bool isRendering = false;

  bool operator==(const VolumeStatus&) const = default;
};

/// The file that tells other programs what is going on, replaced as a whole. Used by one thread.
class StatusFile {
public:
  using Clock = std::chrono::steady_clock;

  explicit StatusFile(std::string path) : path_(std::move(path)) {}

  /// Writes the file if the status has changed, at most once a second while something is rendered.
  /// Returns when it has to be called again, if it was too early.
  std::optional<Clock::time_point> Update(const std::vector<VolumeStatus>& volumes);

private:
  void Write(const std::vector<VolumeStatus>& volumes) const;

  const std::string path_;
  std::optional<std::vector<VolumeStatus>> written_;
  Clock::time_point writtenAt_;
};

} // namespace orva::transcoder
