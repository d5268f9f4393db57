#include "DatabaseFile.h"

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

/// A descriptor for as long as the scope lives; -1 when the file could not be opened.
class Descriptor {
public:
  Descriptor(const std::string& path, int flags)
      : descriptor_(open(path.c_str(), flags | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC)) {}
  Descriptor(const Descriptor&) = delete;
  Descriptor& operator=(const Descriptor&) = delete;
  ~Descriptor() {
    if (descriptor_ != -1) {
      close(descriptor_);
    }
  }

  int Get() const noexcept { return descriptor_; }

private:
  int descriptor_;
};

/// Bytes and 512-byte blocks of a file, none when it is not there.
struct Extent {
  long long size = 0;
  long long blocks = 0;
};

/// What the regular file at `path` takes. One that is `written` must have no other name, which may
/// be that of somebody else's.
Extent RegularExtent(const std::string& path, bool written) {
  struct stat status {};
  if (lstat(path.c_str(), &status) != 0) {
    return {};
  }
  if (!S_ISREG(status.st_mode)) {
    throw util::FormatString("%s:%d: '%s' is not a regular file", __FILE__, __LINE__, path.c_str());
  }
  if (written && status.st_nlink > 1) {
    throw util::FormatString("%s:%d: '%s' has another name", __FILE__, __LINE__, path.c_str());
  }
  return {.size = status.st_size, .blocks = status.st_blocks};
}

/// The size of a file, of which holes count for little: what bounds the work on a file is not to be
/// had for nothing. A file system that compresses has few holes by this measure.
long long SizeWithoutHoles(const Extent& extent) {
  constexpr long long blockSize = 512;
  constexpr long long mostFree = 4 << 20;
  constexpr long long mostPerPlaced = 16;
  return std::min(extent.size, mostFree + mostPerPlaced * blockSize * extent.blocks);
}

void Synchronise(const std::string& path, int flags, bool mayBeUnsupported) {
  const Descriptor file(path, O_RDONLY | flags);
  if (file.Get() == -1 || (fsync(file.Get()) != 0 && !(mayBeUnsupported && errno == EINVAL))) {
    throw util::FormatString("%s:%d: cannot synchronise '%s': %s", __FILE__, __LINE__, path.c_str(),
                             std::strerror(errno));
  }
}

/// Returns whether nothing is there afterwards.
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
  const Extent database = RegularExtent(path, written);
  Extent log;
  for (const char* const suffix : LOG_SUFFIXES) {
    // SQLite writes into some of these, and gives others the owner of the database, also where it
    // only reads. Only the write-ahead log is part of what is read.
    const Extent beside = RegularExtent(path + suffix, true);
    log = suffix == std::string_view("-wal") ? beside : log;
  }
  // Where neither takes any room, the file system does not tell.
  return database.blocks == 0 && log.blocks == 0
             ? database.size + log.size
             : SizeWithoutHoles(database) + SizeWithoutHoles(log);
}

void CheckJournal(const std::string& path) {
  // What ends in this belongs to a transaction over several databases, which we never make; when
  // it has been undone, SQLite deletes the file whose name stands before.
  constexpr std::array<unsigned char, 8> superJournalMark{0xd9, 0xd5, 0x05, 0xf9,
                                                          0x20, 0xa1, 0x63, 0xd7};
  const std::string name = path + LOG_SUFFIXES.front();
  const Descriptor journal(name, O_RDONLY);
  std::array<unsigned char, superJournalMark.size()> end{};
  constexpr auto length = static_cast<off_t>(superJournalMark.size());
  const off_t begin = journal.Get() == -1 ? -1 : lseek(journal.Get(), -length, SEEK_END);
  if (begin != -1 && pread(journal.Get(), end.data(), end.size(), begin) == length &&
      end == superJournalMark) {
    throw util::FormatString("%s:%d: '%s' names another file", __FILE__, __LINE__, name.c_str());
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
    throw util::FormatString("%s:%d: cannot remove what is left of '%s'", __FILE__, __LINE__,
                             to.c_str());
  }
  if (std::rename(from.c_str(), to.c_str()) != 0) {
    throw util::FormatString("%s:%d: cannot rename '%s' to '%s': %s", __FILE__, __LINE__,
                             from.c_str(), to.c_str(), std::strerror(errno));
  }
  // Some file systems cannot synchronise a directory, and need not.
  Synchronise(to.substr(0, to.rfind('/') + 1), O_DIRECTORY, true);
}

bool IsAbsentOrEmpty(const std::string& path) {
  struct stat status {};
  return lstat(path.c_str(), &status) == 0 ? status.st_size == 0 : errno == ENOENT;
}

} // namespace orva::db
