#include "Convergence.h"

#include "transcoder/Photos.h"

#include "CatalogSchema.h"
#include "Indexer.h"
#include "Renditions.h"
#include "Sql.h"
#include "orvadb/VolumeDB.h"

#include <SQLiteCpp/SQLiteCpp.h>

#include <algorithm>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <set>
#include <utility>

namespace orva::test {

namespace fs = std::filesystem;

namespace {

constexpr char LOCATOR[] = "/tmp/zophotodbmerger.conf";
constexpr char SCRATCH[] = "/run/package/fresh";
constexpr int BUSY_TIMEOUT = 10'000; // milliseconds

constexpr char CATALOG_ROWS[] =
    "SELECT path, category, lastModifiedDate, isBackup, isHidden, isSystem, ext, size FROM Files "
    "WHERE isDeleted = 0 UNION ALL "
    "SELECT path, category, lastModifiedDate, isBackup, isHidden, isSystem, '', 0 FROM Folders "
    "WHERE isDeleted = 0";

std::string NameOf(const UserFiles& files) {
  return fs::path(files.Root()).filename();
}

std::string CatalogOf(const UserFiles& files) {
  return files.At(".orva/orva.db");
}

Lines Sorted(Lines lines) {
  std::ranges::sort(lines);
  return lines;
}

void Compare(const std::string& what, const Lines& expected, const Lines& found,
             Lines& differences) {
  const auto add = [&](const char* side, const Lines& lines, const Lines& others) {
    Lines only;
    std::ranges::set_difference(lines, others, std::back_inserter(only));
    for (const std::string& line : only) {
      differences.push_back(what + side + line);
    }
  };
  add(", missing: ", expected, found);
  add(", wrong: ", found, expected);
}

} // namespace

Lines QueryDatabase(const std::string& path, const std::string& sql) {
  const SQLite::Database database(path, SQLite::OPEN_READONLY, BUSY_TIMEOUT);
  SQLite::Statement statement(database, sql);
  Lines rows;
  while (statement.executeStep()) {
    std::string& row = rows.emplace_back();
    for (int column = 0; column < statement.getColumnCount(); ++column) {
      row += column == 0 ? "" : "|";
      row += statement.getColumn(column).getText("NULL");
    }
  }
  return rows;
}

Convergence::Convergence(Templates& templates, const std::vector<const UserFiles*>& volumes)
    : templates_(templates) {
  fs::remove_all(SCRATCH);
  fs::create_directories(SCRATCH);
  for (const UserFiles* const files : volumes) {
    ExpectVolume(*files);
  }
  ExpectMerged();
}

/// Makes a new catalog that lists all photos except those that cannot be rendered.
void Convergence::ExpectVolume(const UserFiles& files) {
  const std::string place = std::string(SCRATCH) + "/" + NameOf(files);
  fs::create_directories(place);
  Volume volume{.files = &files};
  {
    const auto database = catalog::OpenCatalog(place);
    catalog::Indexer(*database, files.Root(), std::time(nullptr)).Run();
    for (const auto& [path, index] : files.Files()) {
      const long long photo = catalog::SelectNumber(
          *database, "SELECT id FROM Files WHERE path = ? AND category = 3", path);
      if (photo != 0 && templates_.IsRenderable(index)) {
        volume.photos[path] = index;
      } else if (photo != 0) {
        catalog::Execute(*database, "DELETE FROM Transcodings WHERE sourceId = ?", photo);
        catalog::Execute(*database, "UPDATE Files SET status = 2 WHERE id = ?", photo);
      }
    }
    catalog::Checkpoint(*database);
  }
  volume.catalog = Sorted(QueryDatabase(place + "/.orva/orva.db", CATALOG_ROWS));
  volumes_.push_back(std::move(volume));
}

void Convergence::ExpectMerged() {
  RunChecked({"/run/package/fresh-merge", SCRATCH});
  merged_ = ReadMerged(std::string(SCRATCH) + "/merged.db");
}

/// Ids and times of merges differ. A volume that was unplugged keeps its row of Statistics.
Lines Convergence::ReadMerged(const std::string& database) const {
  std::string volumes;
  for (const Volume& volume : volumes_) {
    volumes += (volumes.empty() ? "'" : ", '") + volume.files->Root() + "/'";
  }
  return Sorted(QueryDatabase(
      database, "SELECT 'file', d.name || f.name, f.volume FROM Files f LEFT JOIN Folders d "
                "ON d.folder_id = f.folder_id UNION ALL "
                "SELECT 'folder', f.name || ' in ' || coalesce(p.name, '-'), f.volume "
                "FROM Folders f LEFT JOIN Folders p ON p.folder_id = f.parent_folder_id UNION ALL "
                "SELECT 'photos', photos_xcoded || '/' || photos_total, volume FROM Statistics "
                "WHERE volume IN (" +
                    volumes + ")"));
}

Lines Convergence::Differences() const {
  Lines differences;
  for (const Volume& volume : volumes_) {
    try {
      CompareCatalog(volume, differences);
      CompareRenditions(volume, differences);
    } catch (const SQLite::Exception& error) {
      differences.push_back("catalog of " + volume.files->Root() + ": " + error.what());
    }
  }
  try {
    CompareMerged(differences);
  } catch (const SQLite::Exception& error) {
    differences.push_back(std::string("merged database: ") + error.what());
  }
  return differences;
}

void Convergence::CompareCatalog(const Volume& volume, Lines& differences) const {
  const std::string path = CatalogOf(*volume.files);
  const std::string name = "catalog of " + volume.files->Root();
  Compare(name, volume.catalog, Sorted(QueryDatabase(path, CATALOG_ROWS)), differences);
  for (const std::string& row :
       QueryDatabase(path, "SELECT path FROM Files WHERE category = 3 AND status = 1 AND "
                           "isDeleted = 0")) {
    differences.push_back(name + ", waits: " + row);
  }
}

/// Compares the files below the renditions' folder with the photos that the catalog lists.
void Convergence::CompareRenditions(const Volume& volume, Lines& differences) const {
  const std::string name = "renditions of " + volume.files->Root();
  std::set<std::string> expected;
  Lines listed;
  std::map<std::string, std::string> paths; // of the listed photos, by their rendition
  const SQLite::Database database(CatalogOf(*volume.files), SQLite::OPEN_READONLY, BUSY_TIMEOUT);
  SQLite::Statement rows(database,
                         "SELECT id, path FROM Files WHERE isDeleted = 0 AND status = 3 AND id IN "
                         "(SELECT sourceId FROM Transcodings WHERE status = 1)");
  while (rows.executeStep()) {
    listed.push_back(rows.getColumn(1).getString());
    paths[volume.files->At(catalog::RenditionPath(rows.getColumn(0).getInt64()))] = listed.back();
  }
  Lines photos;
  for (const auto& [path, index] : volume.photos) {
    photos.push_back(path);
  }
  Compare("listed in " + volume.files->Root(), photos, Sorted(listed), differences);

  Lines found;
  const std::string folder = volume.files->At(catalog::RENDITIONS);
  std::error_code ignored;
  for (auto entry = fs::recursive_directory_iterator(folder, ignored);
       !ignored && entry != fs::end(entry); entry.increment(ignored)) {
    if (!entry->is_directory()) {
      found.push_back(entry->path());
    }
  }
  Lines needed;
  for (const auto& [rendition, path] : paths) {
    needed.push_back(rendition);
  }
  Compare(name, Sorted(needed), Sorted(found), differences);
  for (const std::string& rendition : found) {
    const auto path = paths.find(rendition);
    const auto photo = path == paths.end() ? volume.photos.end() : volume.photos.find(path->second);
    if (photo == volume.photos.end()) {
      continue; // reported above
    }
    const std::string problem = templates_.Examine(photo->second, rendition);
    if (!problem.empty()) {
      differences.push_back(rendition + " of " + photo->first + ": " + problem);
    }
  }
}

void Convergence::CompareMerged(Lines& differences) const {
  std::ifstream file(LOCATOR);
  std::string line;
  std::getline(file, line);
  Compare("merged database", merged_, ReadMerged(line.substr(line.find('=') + 1)), differences);
}

} // namespace orva::test
