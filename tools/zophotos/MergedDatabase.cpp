#include "MergedDatabase.h"

#include "Failure.h"

#include <SQLiteCpp/Backup.h>
#include <SQLiteCpp/Exception.h>
#include <SQLiteCpp/Statement.h>
#include <sqlite3.h>

#include <array>
#include <filesystem>
#include <fstream>
#include <system_error>
#include <utility>

namespace orva::zophotos {

namespace {

/// Milliseconds to wait for a lock: longer than a usual merge takes to commit.
constexpr int BUSY_TIMEOUT = 5000;

/// Databases on volumes are untrusted: nothing that their schema defines may run.
void DisableUntrustedFeatures(SQLite::Database& database) {
  for (const auto& [option, value] :
       {std::pair(SQLITE_DBCONFIG_ENABLE_VIEW, 0), std::pair(SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0),
        std::pair(SQLITE_DBCONFIG_DEFENSIVE, 1)}) {
    sqlite3_db_config(database.getHandle(), option, value, nullptr);
  }
}

/// Requires the daemon's tables and text encoding. UTF-16 texts are not sorted by their bytes.
void RequireMergedDatabase(SQLite::Database& database, const std::string& path) {
  const std::string fault = path + " is not a merged photo database: ";
  for (const char* const table : {"Status", "Statistics", "Folders", "Files"}) {
    if (!database.tableExists(table)) {
      throw Failure(ExitStatus::Failed, fault + "it has no table " + table);
    }
  }
  const std::string encoding = database.execAndGet("PRAGMA encoding").getString();
  if (encoding != "UTF-8") {
    throw Failure(ExitStatus::Failed, fault + "its text encoding is " + encoding);
  }
}

/// Whether the file's header says that it uses a write-ahead log. SQLite creates the log's files
/// even for connections that only read.
bool HasWriteAheadLog(const std::string& path) {
  constexpr std::size_t readVersion = 19;
  constexpr char writeAheadLog = 2;
  std::array<char, 20> header{};
  std::ifstream(path, std::ios::binary).read(header.data(), header.size());
  return header.at(readVersion) == writeAheadLog;
}

/// Reports a failure to open this file as Failure, so that Explain can take SQLITE_CANTOPEN for a
/// failure to create the private copy.
SQLite::Database Connect(const std::string& path) {
  try {
    return {path, SQLite::OPEN_READONLY, BUSY_TIMEOUT};
  } catch (const SQLite::Exception& error) {
    throw Failure(ExitStatus::Failed, path + ": " + error.what());
  }
}

/// Opens the file without checking its content.
SQLite::Database OpenFile(const std::string& path) {
  std::error_code error;
  const auto type = std::filesystem::status(path, error).type();
  if (type == std::filesystem::file_type::not_found) {
    throw Failure(ExitStatus::NoDatabase, "no merged database: " + path + " does not exist");
  }
  if (type != std::filesystem::file_type::regular) {
    throw Failure(ExitStatus::Failed,
                  path + (error ? ": " + error.message() : " is not a regular file"));
  }
  if (HasWriteAheadLog(path)) {
    throw Failure(ExitStatus::Failed,
                  path + " uses a write-ahead log, unlike the daemon's databases; reading it would "
                         "create files next to it");
  }
  SQLite::Database database = Connect(path);
  DisableUntrustedFeatures(database);
  return database;
}

/// Copies a few MiB at a time, so that a merge can commit in between. SQLite then restarts the
/// copy. After too many restarts it copies the rest in one step.
void CopyPages(SQLite::Database& from, SQLite::Database& to) {
  constexpr int pages = 2048;
  constexpr int mostTries = 5;
  SQLite::Backup backup(to, from);
  for (long long copied = 0;; copied += pages) {
    const bool patient = copied <= static_cast<long long>(backup.getTotalPageCount()) * mostTries;
    const int code = backup.executeStep(patient ? pages : -1);
    if (code == SQLITE_DONE) {
      return;
    }
    if (code != SQLITE_OK) {
      throw SQLite::Exception(sqlite3_errstr(code), code);
    }
  }
}

/// Whether a hot journal has to be rolled back. Exceptions of CopyPages have the extended code as
/// their error code.
bool IsInterruptedMerge(const SQLite::Exception& error) {
  return error.getExtendedErrorCode() == SQLITE_READONLY_ROLLBACK ||
         error.getErrorCode() == SQLITE_READONLY_ROLLBACK;
}

} // namespace

SQLite::Database OpenDatabase(const std::string& path) {
  SQLite::Database database = OpenFile(path);
  RequireMergedDatabase(database, path);
  return database;
}

SQLite::Database CopyDatabase(const std::string& path) {
  SQLite::Database copy("", SQLite::OPEN_READWRITE | SQLite::OPEN_CREATE);
  DisableUntrustedFeatures(copy);
  {
    SQLite::Database database = OpenFile(path);
    CopyPages(database, copy);
  }
  RequireMergedDatabase(copy, path);
  return copy;
}

void Walk(SQLite::Database& copy, const std::function<void(const Item&)>& visit) {
  // Uses the index on Folders.name, so only the files of one folder are sorted at a time.
  SQLite::Statement query(copy,
                          "SELECT o.folder_id, o.name, f.name, o.volume, o.modified_date, "
                          "f.modified_date, f.created_date FROM Folders o LEFT JOIN Files f "
                          "ON f.folder_id = o.folder_id ORDER BY o.name, o.folder_id, f.name");
  while (query.executeStep()) {
    Item item{.folderId = query.getColumn(0).getInt64(),
              .folder = query.getColumn(1).getString(),
              .file = std::nullopt,
              .volume = query.getColumn(3).getString(),
              .folderModified = query.getColumn(4).getInt64(),
              .modified = query.getColumn(5).getInt64(),
              .created = query.getColumn(6).getInt64()};
    if (!query.getColumn(2).isNull()) {
      item.file = query.getColumn(2).getString();
    }
    visit(item);
  }
}

void WalkPhotos(SQLite::Database& copy, const std::function<void(const Photo&)>& visit) {
  // The default of 2 MiB makes SQLite sort in many small parts.
  copy.exec("PRAGMA cache_size = -8192");
  // Results of || are texts, which are sorted by their bytes.
  SQLite::Statement query(
      copy,
      "SELECT coalesce(o.name, '') || f.name AS path, coalesce(o.volume, '') || '' AS volume, "
      "f.modified_date, f.created_date FROM Folders o JOIN Files f ON f.folder_id = "
      "o.folder_id WHERE f.name IS NOT NULL ORDER BY path, 2, 3, 4");
  Photo photo;
  const auto assign = [&query](std::string& text, int column) {
    const SQLite::Column value = query.getColumn(column);
    text.assign(value.getText(), static_cast<std::size_t>(value.getBytes()));
  };
  while (query.executeStep()) {
    assign(photo.path, 0);
    assign(photo.volume, 1);
    photo.modified = query.getColumn(2).getInt64();
    photo.created = query.getColumn(3).getInt64();
    visit(photo);
  }
}

bool IsDamage(const SQLite::Exception& error) {
  const int code = error.getErrorCode() & 0xFF;
  return code == SQLITE_CORRUPT || code == SQLITE_NOTADB;
}

bool IsLocked(const SQLite::Exception& error) {
  const int code = error.getErrorCode() & 0xFF;
  return code == SQLITE_BUSY || code == SQLITE_LOCKED || IsInterruptedMerge(error);
}

std::string Explain(const SQLite::Exception& error, const std::string& path) {
  if (IsInterruptedMerge(error)) {
    return path +
           " has an interrupted merge to roll back; the daemon does that when it opens the database";
  }
  if (IsLocked(error)) {
    return path + " is locked, for example while a large merge commits; try again";
  }
  const int code = error.getErrorCode() & 0xFF;
  if (code == SQLITE_FULL || code == SQLITE_CANTOPEN) {
    return std::string(code == SQLITE_FULL ? "no space" : "no writable folder") +
           " for a private copy of " + path + "; set SQLITE_TMPDIR to another folder";
  }
  return path + ": " + error.what();
}

} // namespace orva::zophotos
