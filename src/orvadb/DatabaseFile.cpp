#include "DatabaseFile.h"

#include "orvadb/ErrorMessage.h"

#include "orvautil/FileDescriptor.h"
#include "orvautil/FormatString.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string_view>

namespace orva::db {

namespace {

constexpr std::array<const char*, 3> LOG_SUFFIXES{"-journal", "-wal", "-shm"};

util::FileDescriptor OpenFile(const std::string& path, int flags) {
  return util::FileDescriptor(open(path.c_str(), flags | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
}

/// Size of a file that may have holes; zero when it does not exist.
struct FileSize {
  long long bytes = 0;
  long long blocks = 0; ///< of 512 bytes, that are allocated
};

/// The size of the regular file at `path`. A file to be `written` must not have a hard link: the
/// other name may belong to another owner.
FileSize RegularFileSize(const std::string& path, bool written) {
  struct stat status {};
  if (lstat(path.c_str(), &status) != 0) {
    return {};
  }
  if (!S_ISREG(status.st_mode)) {
    throw ErrorMessage(util::FormatString("'%s' is not a regular file", path.c_str()));
  }
  if (written && status.st_nlink > 1) {
    throw ErrorMessage(util::FormatString("'%s' has another name", path.c_str()));
  }
  return {.bytes = status.st_size, .blocks = status.st_blocks};
}

/// The bytes of a file, with most of its holes left out: a sparse file must not raise the limits. A
/// file that the file system compresses has fewer blocks than bytes, too, but not so few.
long long BytesWithoutHoles(const FileSize& size) {
  constexpr long long blockSize = 512;
  constexpr long long mostFree = 4 << 20;
  constexpr long long mostPerAllocated = 16;
  return std::min(size.bytes, mostFree + mostPerAllocated * blockSize * size.blocks);
}

void Synchronise(const std::string& path, int flags, bool mayBeUnsupported) {
  const util::FileDescriptor file = OpenFile(path, O_RDONLY | flags);
  if (!file || (fsync(file.Get()) != 0 && !(mayBeUnsupported && errno == EINVAL))) {
    throw ErrorMessage(
        util::FormatString("cannot synchronise '%s': %s", path.c_str(), std::strerror(errno)));
  }
}

/// Removes the file at `path`, if it exists. Returns true if nothing remains.
bool Remove(const std::string& path) {
  return unlink(path.c_str()) == 0 || errno == ENOENT;
}

bool RemoveLogs(const std::string& path) {
  bool gone = true;
  for (const char* const suffix : LOG_SUFFIXES) {
    gone = Remove(path + suffix) && gone;
  }
  return gone;
}

} // namespace

long long CheckDatabaseFiles(const std::string& path, bool written) {
  const FileSize database = RegularFileSize(path, written);
  FileSize log;
  for (const char* const suffix : LOG_SUFFIXES) {
    // Even to read a database SQLite may write into these files or change their owner. Only the
    // write-ahead log holds content of the database.
    const FileSize size = RegularFileSize(path + suffix, true);
    log = suffix == std::string_view("-wal") ? size : log;
  }
  // Some file systems do not count blocks.
  return database.blocks == 0 && log.blocks == 0
             ? database.bytes + log.bytes
             : BytesWithoutHoles(database) + BytesWithoutHoles(log);
}

void CheckJournal(const std::string& path) {
  // A journal that ends in this mark belongs to a transaction over several databases, which we
  // never make. After undoing it SQLite deletes the file whose name precedes the mark.
  constexpr std::array<unsigned char, 8> superJournalMark{0xd9, 0xd5, 0x05, 0xf9,
                                                          0x20, 0xa1, 0x63, 0xd7};
  const std::string name = path + LOG_SUFFIXES.front();
  const util::FileDescriptor journal = OpenFile(name, O_RDONLY);
  std::array<unsigned char, superJournalMark.size()> end{};
  constexpr auto length = static_cast<off_t>(superJournalMark.size());
  const off_t begin = journal ? lseek(journal.Get(), -length, SEEK_END) : -1;
  if (begin != -1 && pread(journal.Get(), end.data(), end.size(), begin) == length &&
      end == superJournalMark) {
    throw ErrorMessage(util::FormatString("'%s' names another file", name.c_str()));
  }
}

bool RemoveDatabase(const std::string& path) {
  const bool gone = Remove(path);
  return RemoveLogs(path) && gone;
}

void PublishDatabase(const std::string& from, const std::string& to) {
  Synchronise(from, 0, false);
  CheckDatabaseFiles(to, true);
  if (!RemoveLogs(to)) {
    throw ErrorMessage(util::FormatString("cannot remove what is left of '%s'", to.c_str()));
  }
  if (std::rename(from.c_str(), to.c_str()) != 0) {
    throw ErrorMessage(util::FormatString("cannot rename '%s' to '%s': %s", from.c_str(),
                                          to.c_str(), std::strerror(errno)));
  }
  // Some file systems cannot synchronise a directory and do not need to.
  Synchronise(to.substr(0, to.rfind('/') + 1), O_DIRECTORY, true);
}

bool IsAbsentOrEmpty(const std::string& path) {
  struct stat status {};
  return lstat(path.c_str(), &status) == 0 ? status.st_size == 0 : errno == ENOENT;
}

} // namespace orva::db
