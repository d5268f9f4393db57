#pragma once

#include "orvautil/Exception.h"
#include "orvautil/FileDescriptor.h"

#include <sys/stat.h>

#include <cstddef>
#include <functional>
#include <map>
#include <string>
#include <vector>

namespace orva::catalog {
class VolumeRoot;
} // namespace orva::catalog

// The renditions on a volume. Other users may rename and replace everything there at any time, so
// each step goes through the descriptor of the folder that it works in, and no existing file is
// opened for writing. Used by one thread at a time.
namespace orva::transcoder {

/// A volume that is full. what() is the same for all of its files.
class VolumeFull : public util::Exception {
public:
  explicit VolumeFull(const catalog::VolumeRoot& root);
};

/// Writes renditions to a volume: first all under temporary names, then Publish. Temporary files
/// that were not published are removed with the object. Failures that concern the whole volume,
/// are thrown as util::Exception, or as VolumeFull.
class RenditionWriter {
public:
  explicit RenditionWriter(const catalog::VolumeRoot& root) : root_(root) {}
  RenditionWriter(const RenditionWriter&) = delete;
  RenditionWriter& operator=(const RenditionWriter&) = delete;
  ~RenditionWriter();

  /// Copies `content`, the rendition of the file `id`. It gets the owner and group of `photo`, and
  /// may be read by those who `mode` says.
  void Add(long long id, const util::FileDescriptor& content, const struct stat& photo,
           mode_t mode);

  /// Writes all of them to the medium and gives them their names. Returns the ids of those whose
  /// name is taken by a folder.
  std::vector<long long> Publish();

private:
  struct Unpublished {
    long long id;
    util::FileDescriptor file;
  };

  const util::FileDescriptor& FolderOf(long long id);

  const catalog::VolumeRoot& root_;
  std::map<long long, util::FileDescriptor> folders_; ///< by the number in their names
  std::vector<Unpublished> unpublished_;
};

/// Removes the rendition of the file `id` if there is one. Returns false when that fails.
bool RemoveRendition(const catalog::VolumeRoot& root, long long id);

/// Examines the folder with the rendition of the file `first`: `expected` are the ids of the
/// photos, in order, that must have a rendition there. Returns those that have none. Removes the
/// files of others, except those of which `isInUse` returns true.
std::vector<long long> CheckFolder(const catalog::VolumeRoot& root, long long first,
                                   const std::vector<long long>& expected,
                                   const std::function<bool(long long)>& isInUse);

/// The first id of each folder of renditions. Removes what is no folder.
std::vector<long long> ListFolders(const catalog::VolumeRoot& root);

/// Removes the folder with the rendition of the file `first`, if it is empty.
void RemoveEmptyFolder(const catalog::VolumeRoot& root, long long first);

} // namespace orva::transcoder
