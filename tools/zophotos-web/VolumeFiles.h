#pragma once

#include "RenditionIds.h"
#include "SnapshotReader.h"

#include "orvautil/FileDescriptor.h"

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace orva::web {

/// An open regular file on a volume. The volume cannot be unmounted meanwhile.
struct VolumeFile {
  util::FileDescriptor file;
  std::uint64_t size = 0;
  std::string tag; ///< entity tag, with its quotation marks: changes with the content
};

/// Finds and opens the files of photos. The volumes and the snapshot are untrusted: only regular
/// files below the folder of a volume directly below /shares are opened, no link is followed, and
/// nothing stays open between the calls. Any thread.
class VolumeFiles {
public:
  /// `log` gets a line when a catalog cannot be read.
  explicit VolumeFiles(RenditionIds::Log log) : ids_(std::move(log)) {}

  /// Opens the photo itself. Returns nothing if there is none, or if it cannot be read.
  std::optional<VolumeFile> OpenOriginal(const Photo& photo) const;

  /// Opens the rendition of the photo, a JPEG.
  std::optional<VolumeFile> OpenRendition(const Photo& photo);

  /// The renditions of these photos will be wanted soon: a page was sent that shows them.
  void Expect(const std::vector<Photo>& photos) { ids_.Expect(photos); }

private:
  RenditionIds ids_;
};

} // namespace orva::web
