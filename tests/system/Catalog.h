#pragma once

#include "Database.h"
#include "Volume.h"

#include <string>

namespace orva::test {

/// The flags of a catalog row.
struct CatalogFlags {
  bool backup = false;
  bool hidden = false;
  bool system = false;
};

/// The media catalog of a volume, row by row as a test wants it. Paths are relative to the
/// volume; a folder's ends in a separator. Folders come before what they hold.
class Catalog {
public:
  /// Makes an empty catalog on the volume.
  explicit Catalog(const Volume& volume) : Catalog(volume.Path()) {}

  /// Makes an empty catalog on the volume whose files are found at `root`.
  explicit Catalog(const std::string& root);

  void AddFolder(const std::string& path, long modified, CatalogFlags flags = {});

  /// A photo whose transcoding was finished at `stamp`.
  void AddPhoto(const std::string& path, long modified, long stamp, CatalogFlags flags = {});

  /// `count` photos in a folder that is there, named "0.jpg" and on, or from `first` on; modified
  /// when their transcoding was finished, at `stamp`.
  void AddPhotos(const std::string& folder, int count, long stamp, int first = 0);

  /// Marks a file as deleted and its transcoding as withdrawn at `stamp`.
  void DeletePhoto(const std::string& path, long stamp);

  void DeleteFolder(const std::string& path);

  /// For what the above do not say.
  const Database& Rows() const { return database_; }

private:
  Database database_;
};

} // namespace orva::test
