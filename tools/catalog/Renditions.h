#pragma once

#include <cstddef>
#include <ctime>
#include <string>
#include <vector>

namespace orva::db {
class DB;
} // namespace orva::db

// The states of a photo's rendition in the catalog; doc/catalog.md describes them. On the
// connection's thread; changes belong into a transaction of the caller. Failures are thrown as
// std::string.
namespace orva::catalog {

/// A photo that waits for its rendition, as the catalog describes it.
struct WaitingPhoto {
  long long id = 0;
  std::string path; ///< relative to the volume
  std::time_t lastModifiedDate = 0;
  long long size = 0; ///< bytes
};

/// At most `count` photos that wait, the newest first: all, or those that follow `previous` in this
/// order.
std::vector<WaitingPhoto> NewestWaiting(const db::DB& catalog, std::size_t count);
std::vector<WaitingPhoto> NewestWaiting(const db::DB& catalog, std::size_t count,
                                        const WaitingPhoto& previous);

/// How many photos wait, and how many have failed.
long long CountWaiting(const db::DB& catalog);
long long CountFailed(const db::DB& catalog);

/// Says that the rendition of `photo` is in its place. Returns false, and changes nothing, if the
/// photo was changed or removed since it was read.
bool MarkFinished(const db::DB& catalog, const WaitingPhoto& photo, std::time_t stamp);

/// Says that `photo` has no rendition until it changes, and why. Merged databases drop the photo if
/// they have it. Returns false, and changes nothing, if it was changed or removed since it was
/// read.
bool MarkFailed(const db::DB& catalog, const WaitingPhoto& photo, const std::string& reason,
                std::time_t stamp);

/// Begin of the reason when a photo could not be opened: it waits again when its permissions
/// change.
inline constexpr char NOT_OPENED[] = "cannot be opened: ";

/// Whether the photo has failed for this reason.
bool WasNotOpened(const db::DB& catalog, long long fileId);

/// Lets the photo wait again if it is finished: its rendition is missing.
void MarkMissing(const db::DB& catalog, long long fileId);

/// At most `count` files that are gone and may still have a rendition.
std::vector<long long> RemovedFiles(const db::DB& catalog, std::size_t count);

/// At most `count` ids from `first` on, in order, of the photos that merged databases list: their
/// renditions must be in their places.
std::vector<long long> ListedPhotos(const db::DB& catalog, long long first, std::size_t count);

/// Whether the file is on the volume: its rendition must not be removed.
bool IsOnVolume(const db::DB& catalog, long long fileId);

/// Says that the file's rendition is removed.
void ForgetRemovedFile(const db::DB& catalog, long long fileId);

/// Name and path of a file's rendition, and its folder, relative to the volume. A folder has at
/// most RENDITIONS_PER_FOLDER: some file systems allow only 65,536 entries.
inline constexpr char RENDITIONS[] = ".orva/renditions";
inline constexpr long long RENDITIONS_PER_FOLDER = 1000;
std::string RenditionFolder(long long fileId);
std::string RenditionName(long long fileId);
std::string RenditionPath(long long fileId);

} // namespace orva::catalog
