#pragma once

#include "DatabaseFiles.h"

#include <sqlite3.h>

#include <string>

namespace orva::db {

/// SQLite's file system for the connections to one database: its default one, but every file is
/// opened and deleted through DatabaseFiles, and nothing else is opened, deleted or looked for,
/// except temporary files. A journal may name a file that SQLite would otherwise open and delete.
/// Any thread.
class DatabaseVfs : sqlite3_vfs {
public:
  /// Registers a file system for the database at `path`, to read or also to write it. Throws
  /// std::string.
  DatabaseVfs(const std::string& path, bool written);
  DatabaseVfs(const DatabaseVfs&) = delete;
  DatabaseVfs& operator=(const DatabaseVfs&) = delete;
  /// No connection uses the file system any more.
  ~DatabaseVfs();

  /// The name for sqlite3_open_v2.
  const char* Name() const noexcept { return zName; }

  const DatabaseFiles& Files() const noexcept { return files_; }

  /// `path` as SQLite spells it for a file system: absolute, without dots.
  static std::string FullPath(const std::string& path);

  /// Why the last file on this thread was refused, and forgets it; empty when none was.
  static std::string TakeRefusal();

private:
  static int Open(sqlite3_vfs* self, const char* path, sqlite3_file* file, int flags,
                  int* outFlags);
  static int Delete(sqlite3_vfs* self, const char* path, int syncDirectory);
  static int Access(sqlite3_vfs* self, const char* path, int flags, int* result);

  /// Whether `path` is a file of the database. Only a journal makes SQLite look for another one.
  bool Accepts(const char* path) const noexcept;

  sqlite3_vfs* original_; ///< the default file system when this one was made
  DatabaseFiles files_;
  std::string name_;
};

} // namespace orva::db
