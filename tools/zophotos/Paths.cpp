#include "Paths.h"

#include "Failure.h"
#include "Text.h"

#include <SQLiteCpp/Statement.h>

#include <algorithm>
#include <filesystem>

namespace orva::zophotos {

std::vector<std::string> Spellings(const std::string& text) {
  std::vector<std::string> spellings;
  const auto add = [&spellings](const std::string& path) {
    if (std::ranges::find(spellings, path) == spellings.end()) {
      spellings.push_back(path);
    }
  };
  for (const std::string& path : {text, Unescape(text)}) {
    const std::string absolute = path.starts_with('/') ? path : "/shares/" + path;
    add(absolute);
    add(std::filesystem::path(absolute).lexically_normal().string());
  }
  return spellings;
}

std::string FolderPath(const std::string& path) {
  return path.ends_with('/') ? path : path + '/';
}

std::string EndOfFolder(const std::string& path) {
  // '0' is the character after '/'.
  return path.substr(0, path.size() - 1) + "0";
}

std::optional<std::string> FindFolder(SQLite::Database& database,
                                      const std::vector<std::string>& spellings) {
  SQLite::Statement query(database, "SELECT 1 FROM Folders WHERE name >= ? AND name < ? LIMIT 1");
  for (const std::string& spelling : spellings) {
    const std::string folder = FolderPath(spelling);
    query.bind(1, folder);
    query.bind(2, EndOfFolder(folder));
    if (query.executeStep()) {
      return folder;
    }
    query.reset();
  }
  return std::nullopt;
}

bool IsFile(SQLite::Database& database, const std::string& path) {
  const std::size_t name = path.rfind('/') + 1;
  SQLite::Statement query(database, "SELECT 1 FROM Folders o JOIN Files f ON f.folder_id = "
                                    "o.folder_id WHERE o.name = ? AND f.name = ?");
  query.bind(1, path.substr(0, name));
  query.bind(2, path.substr(name));
  return query.executeStep();
}

std::optional<std::string> FindGoneVolume(SQLite::Database& database,
                                          const std::vector<std::string>& spellings) {
  SQLite::Statement query(database, "SELECT volume FROM Statistics s WHERE last_updated_time = 0 "
                                    "AND volume NOT IN (SELECT volume FROM Folders) "
                                    "AND volume NOT IN (SELECT volume FROM Files)");
  while (query.executeStep()) {
    const std::string volume = query.getColumn(0).getString();
    if (std::ranges::any_of(spellings, [&](const std::string& spelling) {
          return FolderPath(spelling).starts_with(FolderPath(volume));
        })) {
      return volume;
    }
  }
  return std::nullopt;
}

void ThrowMissing(SQLite::Database& database, const std::vector<std::string>& spellings,
                  const std::string& missing) {
  const auto gone = FindGoneVolume(database, spellings);
  throw Failure(ExitStatus::Negative,
                gone ? "the volume " + *gone +
                           " is gone: it was unplugged, or purged and not merged again yet"
                     : missing);
}

} // namespace orva::zophotos
