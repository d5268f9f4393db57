#pragma once

#include "Staging.h"

#include "Renditions.h"

#include <sys/stat.h>

#include <string>
#include <vector>

namespace orva::transcoder {

/// A photo of a batch. Its place in the batch is its name in the staging folder.
struct BatchPhoto {
  catalog::WaitingPhoto photo;
  struct stat status {}; ///< of the file that was copied
  bool isRaw = false;    ///< of a camera: rendered from the preview in it
  /// Why there is no rendition; empty while it is not known, and when there is one.
  std::string failure{};
  /// Why it was not rendered, if that may pass: it is tried again later. Otherwise empty.
  std::string obstacle{};
  bool isSlow = false;     ///< not rendered in the usual time: it is rendered later, alone
  bool isOutdated = false; ///< the photo was changed since: the result is not used
};

/// Photos of one volume that are rendered together.
struct Batch {
  std::string mountPoint;
  std::string identity; ///< of the catalog
  StagingFolder folder;
  std::vector<BatchPhoto> photos{};
  bool isSlow = false; ///< of one photo that was slow before: only the limits of a photo apply
  /// Why nothing was rendered, although that is not due to the photos; empty otherwise.
  std::string error{};
};

} // namespace orva::transcoder
