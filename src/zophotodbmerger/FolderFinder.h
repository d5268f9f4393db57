#pragma once

#include "orvadb/Statement.h"

#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace orva::dbmerger {

class PhotoDB;

/// Finds folders of the merged database by their paths. For paths in their order it goes along the
/// index, and searches it only where the next entry is not the one. For a database with the own
/// schema. Throws std::string.
class FolderFinder {
public:
  explicit FolderFinder(const PhotoDB& photos) : photos_(photos) {}

  /// The ids of all folders at `path`, the one first that PhotoDB::FindFolder finds. Valid until
  /// the next call.
  std::span<const long long> Find(std::string_view path);

  /// Whether there is a folder at the path, and the first one in the index is on `volume`.
  bool IsOn(std::string_view volume) const { return volume_ == volume; }

  /// Ends the reading. Must be called before folders are changed.
  void Stop() { query_.reset(); }

private:
  bool IsBefore(std::string_view path) const;
  void Search(std::string_view path);
  void Advance();

  const PhotoDB& photos_;
  std::optional<db::Statement> query_; ///< at an entry of the index, unless it is at its end
  bool isAtEnd_ = false;
  std::string lastPath_;
  std::vector<long long> ids_;
  std::optional<std::string> volume_; ///< of the first one found, if it is a text
};

} // namespace orva::dbmerger
