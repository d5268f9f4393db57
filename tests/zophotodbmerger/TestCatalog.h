#pragma once

#include "Database.h"
#include "Messages.h"

#include <string>

namespace orva::test {

/// A row of a catalog's Folders table.
struct FolderRow {
  long id = 0;
  long folderId = -1;
  std::string path{}; ///< relative to the volume
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

/// A row of a catalog's Files table; a photo unless the test says otherwise.
struct FileRow {
  long id = 0;
  long folderId = -1;
  std::string path{}; ///< relative to the volume
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

/// A row of a catalog's Transcodings table; a finished one of the profile that counts unless the
/// test says otherwise.
struct TranscodingRow {
  long sourceId = 0;
  long lastUpdatedDate = 0;
  long status = 1;
  std::string profile = notify::TRANSCODING_PROFILE;
};

/// The media catalog of a volume, column by column as a test wants it.
class TestCatalog {
public:
  /// Makes an empty catalog on the volume, which is any directory.
  explicit TestCatalog(const std::string& mountPoint);

  void Add(const FolderRow& row);
  void Add(const FileRow& row);
  void Add(const TranscodingRow& row);

  /// A visible folder.
  void AddFolder(long id, const std::string& path, long modified = 0);

  /// A photo whose transcoding was finished at `stamp`.
  void AddPhoto(long id, const std::string& path, long modified, long stamp);

  /// Marks a photo as deleted from the volume and its transcoding as withdrawn at `stamp`.
  void DeletePhoto(long id, long stamp);

  /// For what the above do not say.
  const Database& Rows() const { return database_; }

private:
  Database database_;
};

} // namespace orva::test
