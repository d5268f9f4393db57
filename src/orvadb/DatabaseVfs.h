#pragma once

#include "DatabaseFiles.h"
#include "ReadCounter.h"

#include <sqlite3.h>

#include <string>

namespace orva::db {

/// SQLite's file system for the connections to one database: its default one, but every file is
/// opened and deleted through DatabaseFiles, and nothing else is opened, deleted or looked for,
/// except temporary files. A journal may name a file that SQLite would otherwise open and delete.
/// Counts what is read from the database and its write-ahead log. Made and destroyed on any thread.
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

  /// Bytes that were read from the database and its write-ahead log, each part counted once.
  long long BytesRead() const noexcept { return database_.counter.Bytes() + log_.counter.Bytes(); }

  /// `path` as SQLite spells it for a file system: absolute, without dots.
  static std::string FullPath(const std::string& path);

  /// Why the last file on this thread was refused; empty when none was since ForgetRefusal.
  static const std::string& LastRefusal() noexcept;
  static void ForgetRefusal() noexcept;

private:
  /// SQLite's functions for an open file, with a counter.
  struct CountedFile {
    sqlite3_io_methods methods{}; ///< comes first: SQLite has its address
    int (*read)(sqlite3_file*, void*, int, sqlite3_int64) = nullptr;
    ReadCounter counter;
  };

  static int CountRead(sqlite3_file* file, void* bytes, int count, sqlite3_int64 offset);
  static int Open(sqlite3_vfs* self, const char* path, sqlite3_file* file, int flags,
                  int* outFlags);
  static int Delete(sqlite3_vfs* self, const char* path, int syncDirectory);
  static int Access(sqlite3_vfs* self, const char* path, int flags, int* result);

  /// Whether `path` is a file of the database. Only a journal makes SQLite look for another one.
  bool Accepts(const char* path) const noexcept;

  sqlite3_vfs* original_; ///< the default file system when this one was made
  DatabaseFiles files_;
  std::string name_;
  CountedFile database_;
  CountedFile log_;
};

} // namespace orva::db
