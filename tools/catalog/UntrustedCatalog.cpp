#include "UntrustedCatalog.h"

#include "CatalogSchema.h"
#include "Sql.h"
#include "VolumeRoot.h"

#include "orvadb/VolumeDB.h"

#include "orvautil/Core.h"
#include "orvautil/FormatString.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <limits>
#include <string_view>
#include <system_error>

namespace orva::catalog {
namespace {

/// Bytes of the longest text or row. The longest of ours has a path twice, and a reason.
constexpr int LONGEST_VALUE = 16 << 10;

/// Bytes. To make an index takes as much memory as the index. Catalogs of earlier versions lack
/// some.
constexpr long long LARGEST_WITHOUT_INDEXES = 64 << 20;

constexpr std::array<const char*, 4> SUFFIXES = {"", "-wal", "-shm", "-journal"};

/// How many catalogs are kept that were set aside.
constexpr int MOST_SET_ASIDE = 3;

/// Readers take stamps as 32-bit numbers.
constexpr long long LAST_STAMP = std::numeric_limits<int>::max();
constexpr long long DAY = 86'400;

/// No catalog has so many rows; the arithmetic on ids cannot overflow.
constexpr long long LAST_ID = 1LL << 53;

CatalogError Failure(int error, const std::string& what) {
  const CatalogProblem problem = error == EROFS                       ? CatalogProblem::ReadOnly
                                 : error == ENOSPC || error == EDQUOT ? CatalogProblem::Full
                                                                      : CatalogProblem::Other;
  return {problem, what + ": " + std::generic_category().message(error)};
}

class LimitedCatalog : public db::VolumeDB {
public:
  explicit LimitedCatalog(const std::string& volume) : VolumeDB(volume, true) {
    sqlite3_limit(Handle(), SQLITE_LIMIT_LENGTH, LONGEST_VALUE);
  }
};

std::string HomeName() {
  return core::GetORVA_HOME("");
}

std::string CatalogName() {
  return core::GetCatalogPath("").substr(HomeName().size() + 1);
}

util::FileDescriptor OpenHome(const VolumeRoot& volume) {
  if (mkdirat(volume.Descriptor(), HomeName().c_str(), 0755) != 0 && errno != EEXIST) {
    throw Failure(errno, HomeName());
  }
  util::FileDescriptor home = volume.Open(HomeName(), O_PATH | O_DIRECTORY);
  if (!home && (errno == ENOTDIR || errno == ELOOP)) {
    throw CatalogError(CatalogProblem::NoFolder, HomeName() + " is not a folder");
  }
  if (!home) {
    throw Failure(errno, HomeName());
  }
  return home;
}

void RefuseReadOnlyVolume(const VolumeRoot& volume) {
  struct statvfs status = {};
  if (fstatvfs(volume.Descriptor(), &status) == 0 && (status.f_flag & ST_RDONLY) != 0) {
    throw Failure(EROFS, HomeName());
  }
}

void RefuseSpecialFiles(int home) {
  for (const char* const suffix : SUFFIXES) {
    const std::string name = CatalogName() + suffix;
    struct stat status = {};
    if (fstatat(home, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
        (!S_ISREG(status.st_mode) || status.st_nlink != 1)) {
      throw CatalogError(CatalogProblem::Foreign,
                         name + " is not a regular file with a single name");
    }
  }
}

void Require(bool condition, const char* message) {
  if (!condition) {
    throw CatalogError(CatalogProblem::Foreign, message);
  }
}

bool IsIdentity(std::string_view text) {
  return text.size() == 32 && std::ranges::all_of(text, [](char c) {
           return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'f');
         });
}

void RefuseImplausibleContent(const db::DB& catalog, std::time_t latest) {
  Require(SelectNumber(catalog, "SELECT count(*) FROM Identity") == 1, "it has no identity");
  Require(SelectNumber(catalog, "SELECT typeof(newestStamp) = 'integer' FROM Identity") == 1 &&
              IsIdentity(Identity(catalog)),
          "its identity is malformed");
  const long long last = std::min<long long>(LAST_STAMP, latest + DAY);
  Require(SelectNumber(catalog, "SELECT newestStamp FROM Identity") >= 0 &&
              NewestStamp(catalog) <= last,
          "it has stamps of the future");
  for (const Sql& sql : {Sql("SELECT max(id) FROM Folders"), Sql("SELECT max(id) FROM Files"),
                         Sql("SELECT max(id) FROM Transcodings")}) {
    Require(SelectNumber(catalog, sql) <= LAST_ID, "it has ids that are too large");
  }
  for (const Sql& sql : {Sql("SELECT min(id) FROM Folders"), Sql("SELECT min(id) FROM Files")}) {
    Require(SelectNumber(catalog, sql) >= 0, "it has negative ids");
  }
}

/// Bytes of the catalog.
long long SizeOf(const db::DB& catalog) {
  return SelectNumber(catalog, "PRAGMA page_count") * SelectNumber(catalog, "PRAGMA page_size");
}

std::unique_ptr<db::VolumeDB> Open(const VolumeRoot& volume, std::time_t latest,
                                   unsigned busyTimeout) {
  auto catalog = ConnectToCatalog(volume);
  SelectNumber(*catalog, util::FormatString("PRAGMA busy_timeout = %u", busyTimeout).c_str());
  Require(HasOwnSchema(*catalog), "it has tables, indexes, triggers or views of others");
  Require(SizeOf(*catalog) <= LARGEST_WITHOUT_INDEXES || HasIndexes(*catalog),
          "it is large and has no indexes");
  Execute(*catalog, "PRAGMA cache_size = -16384");
  SelectNumber(*catalog, "PRAGMA journal_mode = WAL");
  CreateSchema(*catalog, busyTimeout);
  RefuseImplausibleContent(*catalog, latest);
  return catalog;
}

/// SQLite's extended result code in a message of the database layer; 0 if there is none.
int ExtendedCode(std::string_view failure) {
  constexpr std::string_view LABEL = "(extended code ";
  const std::size_t label = failure.find(LABEL);
  int code = 0;
  if (label != std::string_view::npos) {
    std::from_chars(failure.data() + label + LABEL.size(), failure.data() + failure.size(), code);
  }
  return code;
}

bool Exists(int folder, const std::string& name) {
  struct stat status = {};
  return fstatat(folder, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0;
}

std::string AsideName(int number) {
  return util::FormatString("%s.set-aside-%d", CatalogName().c_str(), number);
}

/// Gives a catalog and its logs another name. What is at that name is removed.
void Rename(int home, const std::string& from, const std::string& to) {
  for (const char* const suffix : SUFFIXES) {
    const std::string source = from + suffix;
    const std::string target = to + suffix;
    if (unlinkat(home, target.c_str(), 0) != 0) {
      unlinkat(home, target.c_str(), AT_REMOVEDIR);
    }
    if (Exists(home, source) && renameat(home, source.c_str(), home, target.c_str()) != 0) {
      throw Failure(errno, HomeName() + '/' + source);
    }
  }
}

} // namespace

CatalogProblem ProblemOf(const std::string& failure) {
  const int code = ExtendedCode(failure);
  if (code == SQLITE_IOERR_SHMSIZE) { // no space for the log's index
    return CatalogProblem::Full;
  }
  switch (code & 0xFF) {
  case SQLITE_READONLY:
    return CatalogProblem::ReadOnly;
  case SQLITE_FULL:
    return CatalogProblem::Full;
  case SQLITE_BUSY:
  case SQLITE_LOCKED:
  case SQLITE_PROTOCOL: // other programs open and close the log too often at this moment
    return CatalogProblem::Busy;
  case SQLITE_NOMEM:
    return CatalogProblem::Other;
  case SQLITE_IOERR:
    // The log is longer than its file says, or is not one.
    return code == SQLITE_IOERR_SHORT_READ || code == SQLITE_IOERR_CORRUPTFS
               ? CatalogProblem::Foreign
               : CatalogProblem::Other;
  default:
    return CatalogProblem::Foreign;
  }
}

CatalogProblem ProblemOf(const std::string& failure, const VolumeRoot& volume) {
  return (ExtendedCode(failure) & 0xFF) == SQLITE_CANTOPEN && volume.FreeSpace() == 0
             ? CatalogProblem::Full
             : ProblemOf(failure);
}

std::unique_ptr<db::VolumeDB> ConnectToCatalog(const VolumeRoot& volume) {
  return std::make_unique<LimitedCatalog>(volume.Path());
}

std::unique_ptr<db::VolumeDB> OpenUntrustedCatalog(const VolumeRoot& volume, std::time_t latest,
                                                   unsigned busyTimeout) {
  RefuseReadOnlyVolume(volume);
  RefuseSpecialFiles(OpenHome(volume).Get());
  try {
    return Open(volume, latest, busyTimeout);
  } catch (const std::string& failure) {
    throw CatalogError(ProblemOf(failure, volume), failure);
  }
}

std::string SetCatalogAside(const VolumeRoot& volume) {
  const util::FileDescriptor home = OpenHome(volume);
  for (int number = MOST_SET_ASIDE; number > 1; --number) {
    Rename(home.Get(), AsideName(number - 1), AsideName(number));
  }
  Rename(home.Get(), CatalogName(), AsideName(1));
  return HomeName() + '/' + AsideName(1);
}

void CheckIndexes(const db::DB& catalog) {
  const long long folders = SelectNumber(catalog, "SELECT count(*) FROM Folders NOT INDEXED");
  const long long files = SelectNumber(catalog, "SELECT count(*) FROM Files NOT INDEXED");
  Require(SelectNumber(catalog, "SELECT count(*) FROM Folders INDEXED BY Folders_path") ==
                  folders &&
              SelectNumber(catalog, "SELECT count(*) FROM Folders INDEXED BY Folders_folderId") ==
                  folders &&
              SelectNumber(catalog, "SELECT count(*) FROM Files INDEXED BY Files_path") == files &&
              SelectNumber(catalog, "SELECT count(*) FROM Files INDEXED BY Files_folder") == files,
          "its indexes do not fit its tables");
}

} // namespace orva::catalog
