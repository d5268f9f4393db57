#include "Commands.h"
#include "Json.h"
#include "MergedDatabase.h"
#include "Paths.h"
#include "Table.h"

#include <SQLiteCpp/Statement.h>

#include <vector>

namespace orva::zophotos {

namespace {

struct Entry {
  bool isFolder = false;
  bool isStored = false; ///< false for a folder without a row, known from paths below it
  std::string path{};
  std::string name{}; ///< last component; for a folder with its separator
  std::int64_t files = 0;
  std::int64_t filesBelow = 0; ///< at any depth, with its own
  std::int64_t modified = 0;
  std::string volume{};
};

/// The folders directly in `folder`, taken from the paths of all folders below it, since a removed
/// folder can leave subfolders. Uses the index to skip from one folder to the next.
std::vector<Entry> ReadFolders(SQLite::Database& database, const std::string& folder) {
  SQLite::Statement query(database,
                          "SELECT name, modified_date, volume, (SELECT count(*) FROM Files f WHERE "
                          "f.folder_id = o.folder_id) FROM Folders o WHERE name > ? AND name < ? "
                          "ORDER BY name LIMIT 1");
  std::vector<Entry> entries;
  std::string from = folder;
  for (;;) {
    query.bind(1, from);
    query.bind(2, EndOfFolder(folder));
    if (!query.executeStep()) {
      return entries;
    }
    const std::string found = query.getColumn(0).getString();
    Entry entry{.isFolder = true};
    const std::size_t end = found.find('/', folder.size());
    entry.path = found.substr(0, end == std::string::npos ? end : end + 1);
    entry.name = entry.path.substr(folder.size());
    if (entry.path == found) {
      entry.isStored = true;
      entry.modified = query.getColumn(1).getInt64();
      entry.volume = query.getColumn(2).getString();
      entry.files = query.getColumn(3).getInt64();
    }
    from = end == std::string::npos ? found : EndOfFolder(entry.path);
    entries.push_back(std::move(entry));
    query.reset();
  }
}

void ReadFiles(SQLite::Database& database, const std::string& folder, std::vector<Entry>& entries) {
  SQLite::Statement query(database,
                          "SELECT f.name, f.modified_date, f.volume FROM Folders o JOIN Files f ON "
                          "f.folder_id = o.folder_id WHERE o.name = ? ORDER BY f.name");
  query.bind(1, folder);
  while (query.executeStep()) {
    const std::string name = query.getColumn(0).getString();
    entries.push_back({.isFolder = false,
                       .isStored = true,
                       .path = folder + name,
                       .name = name,
                       .modified = query.getColumn(1).getInt64(),
                       .volume = query.getColumn(2).getString()});
  }
}

/// Sets the numbers of files below the folders.
void CountFilesBelow(SQLite::Database& database, std::vector<Entry>& entries) {
  SQLite::Statement query(database, "SELECT count(*) FROM Folders o JOIN Files f ON f.folder_id = "
                                    "o.folder_id WHERE o.name >= ? AND o.name < ?");
  for (Entry& entry : entries) {
    entry.filesBelow = entry.files;
    // Only an untrusted database has folders without a separator at the end.
    if (entry.isFolder && entry.path.ends_with('/')) {
      query.bind(1, entry.path);
      query.bind(2, EndOfFolder(entry.path));
      query.executeStep();
      entry.filesBelow = query.getColumn(0).getInt64();
      query.reset();
    }
  }
}

/// The files at `path`: one, unless the database is damaged. Their names are their paths.
std::vector<Entry> ReadFile(SQLite::Database& database, const std::string& path) {
  const std::size_t name = path.rfind('/') + 1;
  SQLite::Statement query(database,
                          "SELECT f.modified_date, f.volume FROM Folders o JOIN Files f ON "
                          "f.folder_id = o.folder_id WHERE o.name = ? AND f.name = ?");
  query.bind(1, path.substr(0, name));
  query.bind(2, path.substr(name));
  std::vector<Entry> entries;
  while (query.executeStep()) {
    entries.push_back({.isFolder = false,
                       .isStored = true,
                       .path = path,
                       .name = path,
                       .modified = query.getColumn(0).getInt64(),
                       .volume = query.getColumn(1).getString()});
  }
  return entries;
}

/// What is in a folder, or a file. Throws Failure if there is neither.
std::vector<Entry> Read(SQLite::Database& database, const std::string& item) {
  const std::vector<std::string> spellings = Spellings(item);
  if (const auto folder = FindFolder(database, spellings)) {
    std::vector<Entry> entries = ReadFolders(database, *folder);
    ReadFiles(database, *folder, entries);
    return entries;
  }
  for (const std::string& spelling : spellings) {
    std::vector<Entry> entries = ReadFile(database, spelling);
    if (!entries.empty()) {
      return entries;
    }
  }
  ThrowMissing(database, spellings, "there is no folder or file " + spellings.front());
}

void PrintJson(const Entry& entry) {
  Json line{{"type", entry.isFolder ? "folder" : "file"},
            {"path", ToUtf8(entry.path)},
            {"volume", entry.isStored ? Json(ToUtf8(entry.volume)) : Json()},
            {"modified", entry.isStored ? JsonTime(entry.modified) : Json()}};
  if (entry.isFolder) {
    line["files"] = entry.files;
    line["stored"] = entry.isStored;
    line["files_below"] = entry.filesBelow;
  }
  PrintLine(line);
}

void PrintLong(const std::vector<Entry>& entries, bool colors) {
  Table table({{.heading = "MODIFIED"},
               {.heading = "FILES", .right = true},
               {.heading = "VOLUME", .elastic = true},
               {.heading = "NAME", .elastic = true}});
  for (const Entry& entry : entries) {
    // A volume's top folder has no time.
    table.AddRow({entry.isStored && entry.modified != 0 ? LocalTime(entry.modified) : "-",
                  entry.isFolder ? std::to_string(entry.filesBelow) : "", Printable(entry.volume),
                  Printable(entry.name)},
                 colors && entry.isFolder);
  }
  table.Print(std::cout, TerminalWidth());
}

void PrintNames(const std::vector<Entry>& entries, const Listing& listing) {
  for (const Entry& entry : entries) {
    std::cout << FolderColor(listing.escapes ? Printable(entry.name) : entry.name,
                             listing.colors && entry.isFolder)
              << '\n';
  }
}

} // namespace

ExitStatus List(const std::string& path, const Listing& listing, Form form) {
  std::vector<Entry> entries;
  {
    // Sorting takes long for a folder that holds most of a library.
    SQLite::Database database = CopyDatabase(path);
    entries = Read(database, listing.path);
    if (listing.isLong || form == Form::JsonText) {
      CountFilesBelow(database, entries);
    }
  }
  if (form == Form::JsonText) {
    for (const Entry& entry : entries) {
      PrintJson(entry);
    }
  } else if (listing.isLong) {
    PrintLong(entries, listing.colors);
  } else {
    PrintNames(entries, listing);
  }
  return ExitStatus::Success;
}

} // namespace orva::zophotos
