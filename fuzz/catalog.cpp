// The input is the catalog of a volume. It is merged into a new merged database, removed from it
// and merged again.

#include "Fuzzing.h"

#include "DBMerger.h"
#include "PhotoDB.h"

#include "orvautil/Core.h"
#include "orvautil/FileDescriptor.h"

#include <sqlite3.h>

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>

namespace {

using namespace orva;
using fuzz::Require;

const std::string MASTER = "/shares/Master/";
const std::string VOLUME = "/shares/Volume/";
const std::string MERGED = MASTER + ".zophotos/zophotos.db";
const std::string CATALOG = core::GetCatalogPath(VOLUME);

std::string emptyMerged; ///< content of a new merged database's file

std::string ReadFile(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

/// Replaces the content of a database file, and removes the files that SQLite left next to it.
void WriteDatabase(const std::string& path, const void* data, std::size_t size) {
  for (const char* const suffix : {"-journal", "-wal", "-shm"}) {
    unlink((path + suffix).c_str());
  }
  const util::FileDescriptor file(
      open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644));
  Require(write(file.Get(), data, size) == static_cast<ssize_t>(size), "a file can be written");
}

/// The merged database as other programs see it.
class Merged {
public:
  Merged() {
    sqlite3* handle = nullptr;
    Require(sqlite3_open_v2(MERGED.c_str(), &handle, SQLITE_OPEN_READONLY, nullptr) == SQLITE_OK,
            "the merged database can be opened");
    handle_.reset(handle);
  }

  /// The rows of a query as sorted texts, each column followed by "|".
  std::vector<std::string> Rows(const char* sql) const {
    std::vector<std::string> rows;
    const auto append = [](void* place, int count, char** values, char** /*names*/) {
      std::string row;
      for (int i = 0; i < count; ++i) {
        row.append(values[i] != nullptr ? values[i] : "NULL").append("|");
      }
      static_cast<std::vector<std::string>*>(place)->push_back(row);
      return 0;
    };
    Require(sqlite3_exec(handle_.get(), sql, append, &rows, nullptr) == SQLITE_OK,
            "the merged database can be read");
    std::ranges::sort(rows);
    return rows;
  }

  bool IsEmpty(const char* sql) const { return Rows(sql).empty(); }

  /// Everything but ids and the status row.
  std::vector<std::string> Content() const {
    std::vector<std::string> content =
        Rows("SELECT quote(volume), photos_xcoded, photos_total, last_updated_time FROM Statistics "
             "UNION ALL "
             "SELECT hex(f.name), hex(p.name), f.modified_date, hex(f.volume) "
             "FROM Folders f LEFT JOIN Folders p ON p.folder_id = f.parent_folder_id");
    const std::vector<std::string> files =
        Rows("SELECT hex(o.name), hex(f.name), f.modified_date, f.created_date, hex(f.volume) "
             "FROM Files f LEFT JOIN Folders o ON o.folder_id = f.folder_id");
    content.insert(content.end(), files.begin(), files.end());
    return content;
  }

private:
  struct Closer {
    void operator()(sqlite3* handle) const { sqlite3_close(handle); }
  };
  std::unique_ptr<sqlite3, Closer> handle_;
};

void Examine(const Merged& merged) {
  Require(merged.Rows("PRAGMA integrity_check") == std::vector<std::string>{"ok|"},
          "the merged database is whole");
  Require(merged.IsEmpty("SELECT 1 FROM Files WHERE folder_id NOT IN "
                         "(SELECT folder_id FROM Folders)"),
          "a file has a folder");
  Require(merged.IsEmpty("SELECT 1 FROM Folders WHERE folder_id != 1 AND parent_folder_id NOT IN "
                         "(SELECT folder_id FROM Folders)"),
          "a folder has a parent");
  Require(merged.IsEmpty("SELECT 1 FROM Files WHERE volume != '/shares/Volume/' UNION ALL "
                         "SELECT 1 FROM Folders WHERE folder_id != 1 AND "
                         "volume != '/shares/Volume/'"),
          "every row is the volume's");
  Require(merged.IsEmpty("SELECT 1 FROM Folders WHERE folder_id != 1 AND "
                         "CAST(substr(CAST(name AS BLOB), 1, 15) AS TEXT) != '/shares/Volume/'"),
          "every folder is on the volume");
  Require(merged.IsEmpty("SELECT 1 FROM Folders GROUP BY name HAVING count(*) > 1 UNION ALL "
                         "SELECT 1 FROM Files GROUP BY folder_id, name HAVING count(*) > 1"),
          "nothing is there twice");
  Require(merged.Rows("SELECT folder_id, parent_folder_id, name, modified_date, volume "
                      "FROM Folders WHERE folder_id = 1") ==
              std::vector<std::string>{"1|-1|/shares/|0|<DUMMY>|"},
          "the root folder is there");
  Require(merged.Rows("SELECT count(*) FROM Status") == std::vector<std::string>{"1|"},
          "there is one status row");
}

bool HasFailed(const std::vector<fuzz::LogLine>& log) {
  return std::ranges::any_of(log, [](const fuzz::LogLine& line) {
    return line.text.starts_with("Error that we will ignore ");
  });
}

dbmerger::DBMerger& Merger() {
  static dbmerger::DBMerger merger;
  return merger;
}

} // namespace

int LLVMFuzzerInitialize(int* /*count*/, char*** /*arguments*/) {
  std::filesystem::create_directories(MASTER);
  std::filesystem::create_directories(core::GetORVA_HOME(VOLUME));
  fuzz::ResetStandardOutput();
  dbmerger::PhotoDB(MASTER).Init();
  emptyMerged = ReadFile(MERGED);
  Merger().Wait();
  return 0;
}

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  fuzz::ResetStandardOutput();
  fuzz::TakeLog();
  WriteDatabase(CATALOG, data, size);
  WriteDatabase(MERGED, emptyMerged.data(), emptyMerged.size());

  Merger().MergeDB(MASTER, VOLUME);
  if (HasFailed(fuzz::TakeLog())) {
    Require(ReadFile(MERGED) == emptyMerged, "a merge that failed has changed nothing");
    return 0;
  }
  const std::vector<std::string> content = [] {
    const Merged merged;
    Examine(merged);
    Require(merged.Rows("SELECT volume FROM Statistics") == std::vector<std::string>{VOLUME + "|"},
            "a volume that was merged has statistics");
    return merged.Content();
  }();

  Merger().RemoveVolume(MASTER, VOLUME);
  const Merged emptied;
  Require(emptied.IsEmpty("SELECT 1 FROM Folders WHERE folder_id != 1 UNION ALL "
                          "SELECT 1 FROM Files"),
          "a volume that was removed has left nothing");
  Merger().MergeDB(MASTER, VOLUME);
  Require(!HasFailed(fuzz::TakeLog()), "what was merged can be merged again");
  const Merged merged;
  Examine(merged);
  Require(merged.Content() == content, "the second merge gives what the first one gave");
  return 0;
}
