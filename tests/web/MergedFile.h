#pragma once

#include <SQLiteCpp/Database.h>

#include <cstdint>
#include <string>
#include <vector>

namespace orva::test {

/// A merged database with the daemon's tables, which a test changes as the daemon does.
class MergedFile {
public:
  /// Opens the file at `path`, which is created, with its directory, if it does not exist.
  explicit MergedFile(const std::string& path);

  /// Adds a volume's top folder and statistics. Returns the folder's id.
  std::int64_t AddVolume(const std::string& mountPoint);
  std::int64_t AddFolder(std::int64_t parent, const std::string& path, const std::string& volume);
  std::int64_t AddFile(std::int64_t folder, const std::string& name, std::int64_t modified,
                       const std::string& volume);

  void RemoveFile(std::int64_t id);
  /// Removes a folder and its files, not its subfolders.
  void RemoveFolder(std::int64_t id);
  /// What the daemon does when the volume is unplugged.
  void RemoveVolume(const std::string& mountPoint);
  void SetStatistics(const std::string& mountPoint, int transcoded, int total, int mergedUpTo);

  /// Runs one statement with the values bound to its parameters.
  void Run(const std::string& sql, const std::vector<std::string>& values = {});
  std::int64_t Number(const std::string& sql);

private:
  SQLite::Database database_;
};

} // namespace orva::test
