#pragma once

#include "Database.h"
#include "Messages.h"
#include "Volume.h"

#include <string>

namespace orva::test {

/// A row of a catalog's Folders table. Paths are relative to the volume; a folder's ends in a
/// separator. An id of 0 stands for the next free one.
struct FolderRow {
  long id = 0;
  long folderId = -1;
  std::string path{};
  std::string name{};
  long category = 4;
  long lastModifiedDate = 0;
  bool isBackup = false;
  bool isHidden = false;
  bool isSystem = false;
  bool isDeleted = false;
  long status = 0;
  long lastUpdatedDate = 0;
};

/// A row of a catalog's Files table; a transcoded photo unless the test says otherwise.
struct FileRow {
  long id = 0;
  long folderId = -1;
  std::string path{};
  std::string name{};
  long category = 3;
  long lastModifiedDate = 0;
  bool isBackup = false;
  bool isHidden = false;
  bool isSystem = false;
  bool isDeleted = false;
  long status = 3;
  long lastUpdatedDate = 0;
  std::string ext = "jpg";
  long size = 10;
};

/// A row of a catalog's Transcodings table; finished, and of the profile that counts, unless the
/// test says otherwise.
struct TranscodingRow {
  long sourceId = 0;
  long lastUpdatedDate = 0;
  long status = 1;
  std::string profile = notify::TRANSCODING_PROFILE;
};

/// The flags of a folder or a photo.
struct CatalogFlags {
  bool backup = false;
  bool hidden = false;
  bool system = false;
};

/// The media catalog of a volume.
class Catalog {
public:
  /// Makes an empty catalog on the volume.
  explicit Catalog(const Volume& volume) : Catalog(volume.Path()) {}

  /// Makes an empty catalog on the volume at `mountPoint`, which may be any directory.
  explicit Catalog(const std::string& mountPoint);

  void Add(const FolderRow& row);
  void Add(const FileRow& row);
  void Add(const TranscodingRow& row);

  /// Adds a folder below the folder that its path names; that comes first.
  void AddFolder(const std::string& path, long modified = 0, CatalogFlags flags = {});

  /// Adds a photo whose transcoding was finished at `stamp`.
  void AddPhoto(const std::string& path, long modified, long stamp, CatalogFlags flags = {});

  /// Adds `count` photos to a folder, named "0.jpg" and so on, or from `first` on; modified when
  /// their transcoding was finished, at `stamp`.
  void AddPhotos(const std::string& folder, int count, long stamp, int first = 0);

  /// Marks a photo as deleted and its transcoding as withdrawn at `stamp`.
  void DeletePhoto(const std::string& path, long stamp);

  /// Marks a folder as deleted.
  void DeleteFolder(const std::string& path);

  /// The database, for other changes.
  const Database& Rows() const { return database_; }

private:
  long FolderOf(const std::string& path) const;

  Database database_;
};

} // namespace orva::test
