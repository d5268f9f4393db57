#pragma once

#include "orvautil/FileDescriptor.h"

#include <sys/stat.h>
#include <sys/types.h>

#include <atomic>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace orva::db {

/// The files of one database: the one at its path and the logs that SQLite keeps next to it, which
/// have the same name with a suffix. Other users may rename and replace files there at any time.
/// So the directory is opened once, and a file is only used after the descriptor that was opened
/// in that directory has been checked:
/// - It is a regular file. Links are not followed; FIFOs and devices are not waited for.
/// - The directory is still at its path: a volume that was pulled is not used any more.
/// - A file that may be written has no second name and was not mounted at its name by itself.
/// - If the database is written, its logs belong to its owner or to this process.
/// Any thread. Const operations may run at the same time.
class DatabaseFiles {
public:
  /// What is added to the path of the database for its write-ahead log.
  static constexpr const char* WRITE_AHEAD_LOG = "-wal";

  /// The files of the database at the absolute `path`, to read or also to write it. They need not
  /// exist. If the directory cannot be opened, neither can the files.
  DatabaseFiles(std::string path, bool written);

  const std::string& Path() const noexcept { return path_; }
  /// The directory's path, without a separator at its end.
  const std::string& Directory() const noexcept { return directory_; }

  /// The suffix of `path`, if it is one of these files; the database itself has an empty one.
  std::optional<std::string_view> Suffix(std::string_view path) const;

  /// Opens one of the files as open(2) does. Returns no descriptor, with errno, when that fails. If
  /// the file is refused by the rules above, `refusal` then says why.
  util::FileDescriptor Open(std::string_view suffix, int flags, mode_t mode,
                            std::string& refusal) const;

  /// Opens the directory as open(2) does, for synchronising it.
  util::FileDescriptor OpenDirectory(int flags) const;

  /// Deletes one of the files as unlink(2) does. Returns whether that worked; else errno says why.
  bool Delete(std::string_view suffix) const;

  /// Deletes the database and its logs. Returns true if nothing remains.
  bool DeleteAll() const;

  /// Gives the closed database the path of `target`, in the same directory, where there is none.
  /// First deletes the logs that a former database left there, which would damage this one. After a
  /// crash at any moment there is either no file at the new path or the whole database. Throws
  /// std::string.
  void Publish(const DatabaseFiles& target) const;

  /// Gets the state of one of the files as lstat(2) does. Returns whether that worked; else errno
  /// says why.
  bool Stat(std::string_view suffix, struct stat& status) const;

  /// The same; all zero when there is no file.
  struct stat Status(std::string_view suffix) const;

  /// Whether the database is on a read-only file system.
  bool IsReadOnlyFileSystem() const;

  /// Why the file at `path` is not used; `format` has one %s for it.
  static std::string Refused(const char* format, const std::string& path);

private:
  std::string Name(std::string_view suffix) const;
  std::string Refusal(std::string_view suffix, const struct stat& status) const;
  bool MayBeWritten(std::string_view suffix) const;
  bool IsOnAnotherMount(int descriptor) const;
  bool IsInPlace() const;
  bool DeleteLogs() const;
  void Synchronise() const;

  std::string path_;
  std::string directory_;
  std::string name_; ///< the path's last component
  bool written_;
  util::FileDescriptor folder_; ///< the directory; null if it could not be opened
  int folderError_ = 0;         ///< errno of that
  struct stat folderStatus_ {};
  mutable std::atomic<uid_t> databaseOwner_ = 0; ///< of the database when it was last opened
  std::uint64_t folderMount_ = 0;
};

} // namespace orva::db
