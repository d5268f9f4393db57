// The floor: the least work that a merge of single files can do. A loop on SQLite's C interface
// runs the reader's statements, sorts the rows, inserts every file with one prepared statement, and
// writes two lines per file. It keeps the id of the current folder. It does not look for existing
// rows, so it works on a new database only.

#include "ReaderStatements.h"

#include <sqlite3.h>

#include <unistd.h>

#include <algorithm>
#include <exception>
#include <fstream>
#include <iostream>
#include <iterator>
#include <memory>
#include <stdexcept>
#include <string>
#include <unordered_map>
#include <vector>

namespace {

using namespace orva::bench;

struct Close {
  void operator()(sqlite3* handle) const { sqlite3_close(handle); }
};
struct Finalize {
  void operator()(sqlite3_stmt* statement) const { sqlite3_finalize(statement); }
};
using Database = std::unique_ptr<sqlite3, Close>;
using Statement = std::unique_ptr<sqlite3_stmt, Finalize>;

void Check(int code) {
  if (code != SQLITE_OK && code != SQLITE_ROW && code != SQLITE_DONE) {
    throw std::runtime_error(sqlite3_errstr(code));
  }
}

Database Open(const char* path, int flags) {
  sqlite3* handle = nullptr;
  const int code = sqlite3_open_v2(path, &handle, flags | SQLITE_OPEN_NOMUTEX, nullptr);
  Database database(handle);
  Check(code);
  return database;
}

void Execute(const Database& database, const std::string& sql) {
  Check(sqlite3_exec(database.get(), sql.c_str(), nullptr, nullptr, nullptr));
}

Statement Prepare(const Database& database, const char* sql) {
  sqlite3_stmt* statement = nullptr;
  Check(sqlite3_prepare_v2(database.get(), sql, -1, &statement, nullptr));
  return Statement(statement);
}

bool Step(const Statement& statement) {
  const int code = sqlite3_step(statement.get());
  Check(code);
  return code == SQLITE_ROW;
}

/// Runs a statement and resets it for the next run.
void Run(const Statement& statement) {
  Step(statement);
  sqlite3_reset(statement.get());
}

std::string Text(const Statement& row, int column) {
  const auto* const text = reinterpret_cast<const char*>(sqlite3_column_text(row.get(), column));
  return {text, static_cast<std::size_t>(sqlite3_column_bytes(row.get(), column))};
}

/// `text` must live until the statement has run.
void Bind(const Statement& statement, int index, const std::string& text) {
  Check(sqlite3_bind_text(statement.get(), index, text.data(), static_cast<int>(text.size()),
                          SQLITE_STATIC));
}

void Bind(const Statement& statement, int index, sqlite3_int64 number) {
  Check(sqlite3_bind_int64(statement.get(), index, number));
}

struct Folder {
  std::string path;
  sqlite3_int64 modified;
};

struct File {
  std::string path;
  std::string name;
  sqlite3_int64 modified;
  int isDeleted;
  int status;
  sqlite3_int64 stamp;
};

template <typename Item>
void SortByPath(std::vector<Item>& items) {
  std::ranges::sort(items, {}, &Item::path);
}

std::vector<Folder> ReadFolders(const Database& catalog, const std::string& volume) {
  std::vector<Folder> folders{{volume, 0}};
  const Statement query = Prepare(catalog, SELECT_FOLDERS);
  while (Step(query)) {
    folders.push_back({volume + Text(query, 2), sqlite3_column_int64(query.get(), 5)});
  }
  SortByPath(folders);
  return folders;
}

std::vector<File> ReadFiles(const Database& catalog, const std::string& volume) {
  std::vector<File> files;
  const Statement query = Prepare(catalog, SELECT_CHANGED_FILES);
  Bind(query, 1, 0);
  while (Step(query)) {
    files.push_back({volume + Text(query, 2), Text(query, 3), sqlite3_column_int64(query.get(), 5),
                     sqlite3_column_int(query.get(), 9), sqlite3_column_int(query.get(), 10),
                     sqlite3_column_int64(query.get(), 11)});
  }
  SortByPath(files);
  return files;
}

sqlite3_int64 Count(const Statement& query) {
  return Step(query) ? sqlite3_column_int64(query.get(), 0) : 0;
}

using FolderIds = std::unordered_map<std::string, sqlite3_int64>;

/// The path up to and including the last separator before `end`.
std::string Parent(const std::string& path, std::size_t end) {
  return path.substr(0, path.rfind('/', end) + 1);
}

FolderIds AddFolders(const Database& merged, const std::string& volume,
                     const std::vector<Folder>& folders) {
  FolderIds ids{{"/shares/", 1}};
  const Statement insert = Prepare(
      merged,
      "INSERT INTO Folders(parent_folder_id, name, modified_date, volume) VALUES(?, ?, ?, ?)");
  Bind(insert, 4, volume);
  for (const Folder& folder : folders) {
    Bind(insert, 1, ids.at(Parent(folder.path, folder.path.size() - 2)));
    Bind(insert, 2, folder.path);
    Bind(insert, 3, folder.modified);
    Run(insert);
    ids.emplace(folder.path, sqlite3_last_insert_rowid(merged.get()));
  }
  return ids;
}

void Print(const std::string& line) {
  if (write(STDOUT_FILENO, line.data(), line.size()) != static_cast<ssize_t>(line.size())) {
    throw std::runtime_error("standard output cannot be written");
  }
}

/// Returns the newest stamp.
sqlite3_int64 AddFiles(const Database& merged, const std::string& volume, const FolderIds& folders,
                       const std::vector<File>& files) {
  const Statement insert =
      Prepare(merged, "INSERT INTO Files(folder_id, name, modified_date, volume, created_date) "
                      "VALUES(?, ?, ?, ?, ?)");
  Bind(insert, 4, volume);
  sqlite3_int64 newest = 0;
  std::string folder;
  std::string line;
  for (const File& file : files) {
    line.assign("Processing file ").append(file.path);
    line.append(" isdeleted=").append(std::to_string(file.isDeleted));
    line.append(" status = ").append(std::to_string(file.status)).append("\n");
    Print(line);
    line.assign("Adding file ").append(file.path).append(" for mount ").append(volume);
    line.append("\n");
    Print(line);

    const std::size_t length = file.path.rfind('/') + 1;
    if (file.path.compare(0, length, folder) != 0) {
      folder.assign(file.path, 0, length);
      Bind(insert, 1, folders.at(folder));
    }
    Bind(insert, 2, file.name);
    Bind(insert, 3, file.modified);
    Bind(insert, 5, file.modified);
    Run(insert);
    newest = std::max(newest, file.stamp);
  }
  return newest;
}

std::string Content(const char* path) {
  std::ifstream file(path);
  return {std::istreambuf_iterator<char>(file), {}};
}

void Merge(const char* schema, const char* catalogPath, const char* mergedPath,
           const std::string& volume) {
  const Database catalog = Open(catalogPath, SQLITE_OPEN_READONLY);
  const Database merged = Open(mergedPath, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE);
  for (const Database* database : {&catalog, &merged}) {
    Execute(*database, "PRAGMA cache_size = -65536");
  }
  Execute(merged, "BEGIN IMMEDIATE");
  Execute(merged, Content(schema));

  Execute(catalog, "BEGIN");
  const std::vector<Folder> folders = ReadFolders(catalog, volume);
  const std::vector<File> files = ReadFiles(catalog, volume);
  const Statement rendered = Prepare(catalog, COUNT_RENDERED);
  Bind(rendered, 1, RENDERED_STATUS);
  const sqlite3_int64 renderedPhotos = Count(rendered);
  const sqlite3_int64 photos = Count(Prepare(catalog, COUNT_PHOTOS));

  const FolderIds ids = AddFolders(merged, volume, folders);
  const sqlite3_int64 newest = AddFiles(merged, volume, ids, files);

  const Statement statistics =
      Prepare(merged, "INSERT INTO Statistics(volume, photos_xcoded, photos_total, "
                      "last_updated_time) VALUES(?, ?, ?, ?)");
  Bind(statistics, 1, volume);
  Bind(statistics, 2, renderedPhotos);
  Bind(statistics, 3, photos);
  Bind(statistics, 4, newest);
  Run(statistics);
  Execute(merged, "COMMIT");
}

} // namespace

int main(int argc, char** argv) {
  if (argc == 1) {
    return 0; // measures the start of the process
  }
  if (argc != 5) {
    std::cerr << "usage: floor SCHEMA CATALOG NEW-DATABASE MOUNT-POINT/\n";
    return 2;
  }
  try {
    Merge(argv[1], argv[2], argv[3], argv[4]);
    return 0;
  } catch (const std::exception& error) {
    std::cerr << "floor: " << error.what() << '\n';
    return 1;
  }
}
