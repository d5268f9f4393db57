#include "Activity.h"
#include "Commands.h"
#include "Json.h"
#include "MergedDatabase.h"
#include "Paths.h"

#include "orvadb/ErrorMessage.h"
#include "orvadb/Statement.h"
#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"

#include "orvautil/Core.h"

#include <SQLiteCpp/Exception.h>
#include <SQLiteCpp/Savepoint.h>
#include <SQLiteCpp/Statement.h>

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <optional>
#include <set>
#include <string_view>
#include <system_error>
#include <vector>

namespace orva::zophotos {

namespace {

bool IsMissing(const std::string& path) {
  struct stat status {};
  return lstat(path.c_str(), &status) != 0 && (errno == ENOENT || errno == ENOTDIR);
}

/// Whether a merged database may name this volume: a folder directly in the shares root. The
/// database is untrusted, and reading a catalog in WAL mode creates files next to it.
bool IsInSharesRoot(const std::string& mountPoint) {
  constexpr std::string_view root = "/shares/";
  if (!mountPoint.starts_with(root) || mountPoint.find('\0') != std::string::npos) {
    return false;
  }
  const std::string name = mountPoint.substr(root.size());
  return name.size() > 1 && name.find('/') == name.size() - 1 && name != "./" && name != "../";
}

/// The volumes of the merged database.
std::set<std::string> MergedVolumes(const FindPath& findPath) {
  const std::string path = findPath();
  try {
    SQLite::Database database = OpenDatabase(path);
    SQLite::Statement query(database, "SELECT DISTINCT volume FROM Statistics");
    std::set<std::string> volumes;
    while (query.executeStep()) {
      const std::string volume = query.getColumn(0).getString();
      if (IsInSharesRoot(volume)) {
        volumes.insert(volume);
      }
    }
    return volumes;
  } catch (const SQLite::Exception& error) {
    throw Failure(IsLocked(error) ? ExitStatus::Locked : ExitStatus::Failed, Explain(error, path));
  }
}

/// The volumes of the merged database and of the services. Throws Failure if there is no database,
/// unless the services know a volume.
std::set<std::string> FindVolumes(const FindPath& findPath, const Activity& services) {
  std::set<std::string> volumes;
  for (const auto& [mountPoint, activity] : VolumesOf(services)) {
    volumes.insert(mountPoint);
  }
  try {
    volumes.merge(MergedVolumes(findPath));
  } catch (const Failure& failure) {
    if (failure.Status() != ExitStatus::NoDatabase || volumes.empty()) {
      throw;
    }
  }
  return volumes;
}

/// Which photos to list: all, or those at one path.
class Selection {
public:
  explicit Selection(const std::string& path) : isAll_(path.empty()) {
    if (!isAll_) {
      for (const std::string& spelling : Spellings(path)) {
        folders_.push_back(FolderPath(spelling));
      }
    }
  }

  bool Contains(const std::string& photo) const {
    return IsAny([&](const std::string& folder) { return FolderPath(photo).starts_with(folder); });
  }

  /// Whether photos on the volume can be selected.
  bool Touches(const std::string& mountPoint) const {
    return IsAny([&](const std::string& folder) {
      return mountPoint.starts_with(folder) || folder.starts_with(mountPoint);
    });
  }

  /// Whether all photos are selected, or one of `volumes` can have the path: the path is a mount
  /// point or above one, or there is a file or folder.
  bool IsKnown(const std::set<std::string>& volumes) const {
    return IsAny([&](const std::string& folder) {
      return std::ranges::any_of(
                 volumes,
                 [&](const std::string& mountPoint) { return mountPoint.starts_with(folder); }) ||
             !IsMissing(folder.substr(0, folder.size() - 1));
    });
  }

private:
  template <typename Predicate>
  bool IsAny(const Predicate& predicate) const {
    return isAll_ || std::ranges::any_of(folders_, predicate);
  }

  bool isAll_;
  std::vector<std::string> folders_; ///< the spellings of the path, with a separator at the end
};

/// The failed photos, in a temporary file: a catalog may have any number, and the output may be
/// slow, but a catalog is open only while it is read.
class FailedPhotos {
public:
  FailedPhotos() : database_("", SQLite::OPEN_READWRITE | SQLite::OPEN_CREATE) {
    database_.exec("CREATE TABLE Failed(path TEXT, volume TEXT, reason TEXT)");
  }

  /// Adds those of a volume. Throws std::string, and has added nothing, if its catalog cannot be
  /// read, and SQLite::Exception if there is no space.
  void Read(const std::string& mountPoint, const Selection& selection) {
    SQLite::Savepoint all(database_, "volume");
    const db::VolumeDB catalog(mountPoint, false);
    const db::Transaction oneState(catalog, BUSY_TIMEOUT);
    if (HasFailures(catalog)) {
      catalog.RejectComputedColumns("Files");
      catalog.RejectComputedColumns("Failures");
      Copy(catalog, mountPoint, selection);
    }
    all.release();
  }

  /// Calls `visit(path, volume, reason)` for each photo, by path.
  template <typename Visit>
  void ForEach(const Visit& visit) {
    SQLite::Statement query(database_, "SELECT path, volume, reason FROM Failed ORDER BY path");
    while (query.executeStep()) {
      visit(query.getColumn(0).getString(), query.getColumn(1).getString(),
            query.getColumn(2).getString());
    }
  }

private:
  /// Milliseconds. The indexer's transactions are short.
  static constexpr unsigned BUSY_TIMEOUT = 5000;

  /// The appliance's catalogs and those of earlier versions have no such table.
  static bool HasFailures(const db::VolumeDB& catalog) {
    db::Statement query(catalog,
                        "SELECT 1 FROM sqlite_schema WHERE type = 'table' AND name = 'Failures'");
    return query.Fetch();
  }

  void Copy(const db::VolumeDB& catalog, const std::string& mountPoint,
            const Selection& selection) {
    SQLite::Statement add(database_, "INSERT INTO Failed VALUES(?, ?, ?)");
    // Begins with the failures, which are few.
    db::Statement query(catalog, "SELECT p.path, f.reason FROM Failures f CROSS JOIN Files p "
                                 "ON p.id = f.fileId WHERE p.isDeleted = 0 AND p.status = 2");
    std::size_t bytes = 0;
    while (query.Fetch()) {
      const std::string path = query.GetText(0);
      const std::string reason = query.GetText(1);
      bytes += path.size() + reason.size();
      RequirePlausible(catalog, bytes);
      if (selection.Contains(mountPoint + path)) {
        add.bind(1, mountPoint + path);
        add.bind(2, mountPoint);
        add.bind(3, reason);
        add.exec();
        add.reset();
      }
    }
  }

  /// In a crafted catalog a few pages may produce any number of rows. In others each byte was read.
  static void RequirePlausible(const db::VolumeDB& catalog, std::size_t bytes) {
    constexpr long long least = 1 << 20;
    if (static_cast<long long>(bytes) > least + catalog.BytesRead()) {
      throw db::ErrorMessage("more failed photos than a file of its size can hold");
    }
  }

  SQLite::Database database_;
};

/// The reason in an error message of the database layer, without the place in the source and
/// the statement.
std::string Reason(const std::string& message) {
  const std::size_t colon = message.find(": ");
  const std::size_t begin = colon == std::string::npos ? 0 : colon + 2;
  return message.substr(begin, message.find(" (extended code ", begin) - begin);
}

/// Adds the failed photos of a volume. Returns why its catalog cannot be read; nothing if it was
/// read, or if there is none: the volume is unplugged or not indexed yet.
std::optional<std::string> Read(const std::string& mountPoint, const std::string& catalog,
                                const Selection& selection, FailedPhotos& photos) {
  if (IsMissing(catalog)) {
    return std::nullopt;
  }
  if (access(catalog.c_str(), R_OK) != 0 && errno == EACCES) {
    return std::generic_category().message(EACCES); // SQLite would not say that
  }
  try {
    photos.Read(mountPoint, selection);
    return std::nullopt;
  } catch (const std::string& message) {
    return Reason(message);
  }
}

/// Prints the photos. Returns whether there are any.
bool Print(FailedPhotos& photos, bool escapes, Form form) {
  bool any = false;
  photos.ForEach([&](const std::string& path, const std::string& volume,
                     const std::string& reason) {
    any = true;
    if (form == Form::JsonText) {
      PrintLine({{"path", ToUtf8(path)}, {"volume", ToUtf8(volume)}, {"reason", ToUtf8(reason)}});
    } else {
      std::cout << (escapes ? Printable(path) : path) << '\t' << Printable(reason) << '\n';
    }
  });
  return any;
}

/// Lists the failed photos of `volumes`. Throws Failure with `missing` if nothing is known at the
/// selected path.
ExitStatus ListFailed(const std::set<std::string>& volumes, const Selection& selection,
                      const std::string& missing, bool escapes, Form form) {
  FailedPhotos photos;
  bool isComplete = true;
  for (const std::string& mountPoint : volumes) {
    const std::string catalog = core::GetCatalogPath(mountPoint);
    if (const auto reason = Read(mountPoint, catalog, selection, photos)) {
      isComplete = false;
      std::cerr << "zophotos: " << Printable(catalog + ": " + *reason) << '\n';
    }
  }
  if (!Print(photos, escapes, form) && isComplete) {
    if (!selection.IsKnown(volumes)) {
      throw Failure(ExitStatus::Negative, missing);
    }
    std::cout << (form == Form::Text ? "No photo has failed.\n" : "");
  }
  return isComplete ? ExitStatus::Success : ExitStatus::Negative;
}

} // namespace

ExitStatus ListFailedPhotos(const FindPath& findPath, const Activity& services,
                            const std::string& path, bool escapes, Form form) {
  const Selection selection(path);
  std::set<std::string> volumes = FindVolumes(findPath, services);
  std::erase_if(volumes, [&](const std::string& volume) { return !selection.Touches(volume); });
  if (!path.empty() && volumes.empty()) {
    throw Failure(ExitStatus::Negative, Spellings(path).front() + " is not on a volume");
  }
  const std::string missing =
      path.empty() ? "" : "there is no folder or file " + Spellings(path).front();
  try {
    return ListFailed(volumes, selection, missing, escapes, form);
  } catch (const SQLite::Exception& error) {
    throw Failure(ExitStatus::Failed, Explain(error, "the list"));
  }
}

} // namespace orva::zophotos
