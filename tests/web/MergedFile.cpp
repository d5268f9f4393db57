#include "MergedFile.h"

#include <SQLiteCpp/Column.h>
#include <SQLiteCpp/Statement.h>

#include <filesystem>

namespace orva::test {

namespace {

std::string WithDirectory(const std::string& path) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  return path;
}

} // namespace

MergedFile::MergedFile(const std::string& path)
    : database_(WithDirectory(path), SQLite::OPEN_READWRITE | SQLite::OPEN_CREATE, 60'000) {
  database_.exec("PRAGMA synchronous = OFF");
  if (database_.tableExists("Files")) {
    return;
  }
  database_.exec(
      "BEGIN;"
      "CREATE TABLE Status(id INTEGER PRIMARY KEY AUTOINCREMENT, mc_version CHAR(16) NOT NULL, "
      "mdate INTEGER NOT NULL, desc CHAR(80), etype INTEGER);"
      "CREATE TABLE Statistics(id INTEGER PRIMARY KEY AUTOINCREMENT, volume TEXT NOT NULL, "
      "photos_xcoded INTEGER NOT NULL, photos_total INTEGER NOT NULL, last_updated_time INTEGER "
      "NOT NULL);"
      "CREATE TABLE Folders(folder_id INTEGER PRIMARY KEY AUTOINCREMENT, parent_folder_id INTEGER "
      "NOT NULL, name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume TEXT NOT NULL);"
      "CREATE TABLE Files(file_id INTEGER PRIMARY KEY AUTOINCREMENT, folder_id INTEGER NOT NULL, "
      "name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume TEXT NOT NULL, created_date "
      "INTEGER NOT NULL, FOREIGN KEY(folder_id) REFERENCES Folders(folder_id) ON DELETE CASCADE);"
      "CREATE INDEX Folders_folderId ON Folders(parent_folder_id);"
      "CREATE INDEX Folders_path ON Folders(name);"
      "CREATE INDEX Files_folderId ON Files(folder_id);"
      "CREATE INDEX Files_name ON Files(name);"
      "INSERT INTO Status(mc_version, mdate, desc, etype) VALUES('2.0', 1000, '', 0);"
      "INSERT INTO Folders(parent_folder_id, name, modified_date, volume) VALUES(-1, '/shares/', "
      "0, '<DUMMY>');"
      "COMMIT");
}

std::int64_t MergedFile::AddVolume(const std::string& mountPoint) {
  SetStatistics(mountPoint, 0, 0, 1);
  return AddFolder(1, mountPoint, mountPoint);
}

std::int64_t MergedFile::AddFolder(std::int64_t parent, const std::string& path,
                                   const std::string& volume) {
  Run("INSERT INTO Folders(parent_folder_id, name, modified_date, volume) VALUES(?, ?, 0, ?)",
      {std::to_string(parent), path, volume});
  return database_.getLastInsertRowid();
}

std::int64_t MergedFile::AddFile(std::int64_t folder, const std::string& name,
                                 std::int64_t modified, const std::string& volume) {
  Run("INSERT INTO Files(folder_id, name, modified_date, volume, created_date) VALUES(?1, ?2, ?3, "
      "?4, ?3)",
      {std::to_string(folder), name, std::to_string(modified), volume});
  return database_.getLastInsertRowid();
}

void MergedFile::RemoveFile(std::int64_t id) {
  Run("DELETE FROM Files WHERE file_id = ?", {std::to_string(id)});
}

void MergedFile::RemoveFolder(std::int64_t id) {
  Run("BEGIN");
  Run("DELETE FROM Files WHERE folder_id = ?", {std::to_string(id)});
  Run("DELETE FROM Folders WHERE folder_id = ?", {std::to_string(id)});
  Run("COMMIT");
}

void MergedFile::RemoveVolume(const std::string& mountPoint) {
  Run("BEGIN");
  Run("DELETE FROM Folders WHERE volume = ?", {mountPoint});
  Run("DELETE FROM Files WHERE volume = ?", {mountPoint});
  Run("UPDATE Statistics SET last_updated_time = 0 WHERE volume = ?", {mountPoint});
  Run("COMMIT");
}

void MergedFile::SetStatistics(const std::string& mountPoint, int transcoded, int total,
                               int mergedUpTo) {
  Run("DELETE FROM Statistics WHERE volume = ?", {mountPoint});
  Run("INSERT INTO Statistics(volume, photos_xcoded, photos_total, last_updated_time) VALUES(?, ?, "
      "?, ?)",
      {mountPoint, std::to_string(transcoded), std::to_string(total), std::to_string(mergedUpTo)});
}

void MergedFile::Run(const std::string& sql, const std::vector<std::string>& values) {
  SQLite::Statement statement(database_, sql);
  int index = 0;
  for (const std::string& value : values) {
    statement.bind(++index, value);
  }
  while (statement.executeStep()) {
  }
}

std::int64_t MergedFile::Number(const std::string& sql) {
  return database_.execAndGet(sql).getInt64();
}

} // namespace orva::test
