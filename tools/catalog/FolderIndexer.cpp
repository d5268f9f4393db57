#include "FolderIndexer.h"

#include "CatalogSchema.h"
#include "CatalogWriter.h"
#include "Renditions.h"
#include "Sql.h"
#include "UntrustedCatalog.h"
#include "VolumeRoot.h"

#include "orvadb/Folder.h"

#include "orvautil/Core.h"
#include "orvautil/Exception.h"
#include "orvautil/Path.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <string_view>
#include <system_error>
#include <tuple>

namespace orva::catalog {
namespace {

/// How often the caller's pulse is called: once for so many names or rows.
constexpr std::size_t NAMES_PER_PULSE = 256;

/// Vanished files, and folders, of one folder that an update marks deleted.
constexpr std::size_t MOST_VANISHED = 100'000;

/// Bytes of the longest name on any file system.
constexpr std::size_t LONGEST_NAME = 1024;

struct CloseDirectory {
  void operator()(DIR* directory) const noexcept { closedir(directory); }
};
using Directory = std::unique_ptr<DIR, CloseDirectory>;

/// The entry with this name in a list that is sorted by names; null if there is none.
const auto* FindName(const auto& entries, std::string_view name) {
  const auto found = std::ranges::lower_bound(
      entries, name, {}, [](const auto& entry) { return std::string_view(entry.name); });
  return found != entries.end() && found->name == name ? &*found : nullptr;
}

/// True for the product's own folders in the root of a volume, which are not indexed.
bool IsProductData(const IndexedFolder& folder, std::string_view name) {
  static const std::string home = core::GetORVA_HOME("");
  return folder.path.empty() && (name == home || name == ".zophotos");
}

/// Whether a folder that cannot be opened is no longer there.
bool IsGone(int error) {
  return error == ENOENT || error == ENOTDIR || error == ELOOP;
}

bool IsJoined(std::string_view path, std::string_view folder, std::string_view name,
              std::string_view end = {}) {
  return path.size() == folder.size() + name.size() + end.size() && path.starts_with(folder) &&
         path.substr(folder.size()).starts_with(name) && path.ends_with(end);
}

bool IsPhoto(std::string_view name) {
  return CategoryOf(ExtensionOf(name)) == PHOTO;
}

/// A second row for a path begins with a separator, see Renditions.
bool IsTombstone(std::string_view path) {
  return path.starts_with('/');
}

/// The first path after all that begin with `folder`, which ends in "/".
std::string EndOfTree(std::string folder) {
  folder.back() = '/' + 1;
  return folder;
}

} // namespace

FolderIndexer::FolderIndexer(const db::DB& catalog, const VolumeRoot& volume, NewPhotos newPhotos,
                             std::time_t now, Hooks hooks)
    : catalog_(catalog), volume_(volume), newPhotos_(newPhotos), now_(now),
      hooks_(std::move(hooks)),
      nextFolderId_(SelectNumber(catalog, "SELECT max(id) FROM Folders") + 1),
      nextFileId_(SelectNumber(catalog, "SELECT max(id) FROM Files") + 1) {}

std::time_t FolderIndexer::Stamp() {
  if (stamp_ == 0) {
    stamp_ = NextStamp(catalog_, now_);
  }
  return stamp_;
}

void FolderIndexer::Pulse(std::size_t count) const {
  if (hooks_.pulse && count % NAMES_PER_PULSE == 0) {
    hooks_.pulse();
  }
}

std::vector<IndexedFolder> FolderIndexer::Update(const IndexedFolder& folder) {
  Pulse(0);
  isFinished_ = true;
  util::FileDescriptor descriptor = volume_.Open(folder.path, O_RDONLY | O_DIRECTORY);
  struct stat status = {};
  if (!descriptor || fstat(descriptor.Get(), &status) != 0) {
    // A folder may disappear meanwhile, with all that was in it; the volume must not.
    if (IsGone(errno) && !folder.path.empty()) {
      DeleteTree(folder.path);
    } else {
      LeaveAlone(folder.path, std::generic_category().message(errno));
    }
    return {};
  }
  if (hooks_.opened) {
    hooks_.opened(folder, descriptor.Get());
  }
  if (!folder.path.empty() && status.st_mtime != folder.lastModifiedDate) {
    Execute(catalog_, "UPDATE Folders SET lastModifiedDate = ?, lastUpdatedDate = ? WHERE id = ?",
            status.st_mtime, Stamp(), folder.id);
  }

  const Listing listing = List(folder, descriptor.Release());
  const auto [files, photos, rows] = std::tuple(summary_.files, summary_.photos, summary_.rows);
  const FileChanges changes = CompareFiles(folder, listing);
  std::size_t count = 0;
  for (const FileChange& change : changes.written) {
    UpdateFile(folder, change);
    Pulse(++count);
  }
  for (const FileRow& file : changes.vanished) {
    DeleteFile(file);
    Pulse(++count);
  }
  std::vector<IndexedFolder> folders;
  if (isFinished_) {
    folders = UpdateFolders(folder, listing);
  }
  if (!isFinished_) { // they are counted when this is repeated
    std::tie(summary_.files, summary_.photos, summary_.rows) = std::tie(files, photos, rows);
  }
  return folders;
}

std::optional<IndexedFolder> FolderIndexer::Find(const std::string& path) const {
  if (path.empty()) {
    return IndexedFolder();
  }
  db::Statement row(catalog_, "SELECT id, lastModifiedDate, isBackup, isHidden, isSystem "
                              "FROM Folders WHERE path = ? AND isDeleted = 0");
  row.BindTextView(1, path);
  if (!row.Fetch()) {
    return std::nullopt;
  }
  return IndexedFolder{
      .id = row.GetInt64(0),
      .path = path,
      .flags = {.isBackup = row.GetBool(2), .isHidden = row.GetBool(3), .isSystem = row.GetBool(4)},
      .lastModifiedDate = row.GetTime(1)};
}

// --- The folder --------------------------------------------------------------------------------

/// Takes over `descriptor`.
FolderIndexer::Listing FolderIndexer::List(const IndexedFolder& folder, int descriptor) {
  Listing listing;
  const Directory directory(fdopendir(descriptor));
  if (!directory) {
    const int error = errno;
    close(descriptor);
    throw util::Exception("cannot list a folder: " + std::generic_category().message(error));
  }
  std::size_t count = 0;
  for (;;) {
    errno = 0;
    const dirent* const entry = readdir(directory.get());
    if (entry == nullptr) {
      break;
    }
    const std::string_view name = entry->d_name;
    if (name != "." && name != ".." && !IsProductData(folder, name) &&
        (entry->d_type == DT_REG || entry->d_type == DT_DIR || entry->d_type == DT_UNKNOWN)) {
      Examine(folder, descriptor, entry->d_name, listing);
    }
    Pulse(++count);
  }
  if (errno != 0) {
    listing.isWhole = false;
    LeaveAlone(folder.path, std::generic_category().message(errno));
  }
  std::ranges::sort(listing.folders, {}, &Entry::name);
  std::ranges::sort(listing.files, {}, &Entry::name);
  return listing;
}

void FolderIndexer::Examine(const IndexedFolder& folder, int descriptor, const char* name,
                            Listing& listing) {
  struct stat found = {};
  if (fstatat(descriptor, name, &found, AT_SYMLINK_NOFOLLOW) != 0) {
    if (errno != ENOENT) {
      LeaveAlone(folder.path + name, std::generic_category().message(errno));
      listing.folders.push_back({.name = name, .isFolder = true, .isKnown = false});
      listing.files.push_back({.name = name, .isKnown = false});
    }
  } else if (S_ISDIR(found.st_mode)) {
    listing.folders.push_back({.name = name, .isFolder = true, .lastModifiedDate = found.st_mtime});
  } else if (S_ISREG(found.st_mode)) {
    listing.files.push_back({.name = name,
                             .lastModifiedDate = found.st_mtime,
                             .size = found.st_size,
                             .isLinked = found.st_nlink > 1,
                             .access = {.mode = found.st_mode,
                                        .owner = found.st_uid,
                                        .group = found.st_gid,
                                        .changed = found.st_ctim}});
  }
}

// --- Folders in it -----------------------------------------------------------------------------

/// Keeps nothing of a row but its id, unless its folder is on the volume.
FolderIndexer::FolderRows FolderIndexer::ReadFolderRows(const IndexedFolder& folder,
                                                        const Listing& listing) const {
  FolderRows rows;
  db::Statement row(catalog_, "SELECT id, path, name, lastModifiedDate, isBackup, isHidden, "
                              "isSystem, isDeleted FROM Folders WHERE folderId = ?");
  row.BindInt64(1, folder.id);
  std::size_t count = 0;
  while (row.Fetch()) {
    Pulse(++count);
    const std::string_view path = row.GetTextView(1);
    const std::string_view name = row.GetTextView(2);
    if (!row.IsText(1) || !row.IsText(2) || !IsJoined(path, folder.path, name, "/")) {
      continue;
    }
    const long long id = row.GetInt64(0);
    const bool isDeleted = row.GetBool(7);
    if (const Entry* const entry = FindName(listing.folders, name); entry != nullptr) {
      rows.known.push_back({.entry = entry,
                            .folder = {.id = id,
                                       .path = std::string(path),
                                       .flags = {.isBackup = row.GetBool(4),
                                                 .isHidden = row.GetBool(5),
                                                 .isSystem = row.GetBool(6)},
                                       .lastModifiedDate = row.GetTime(3)},
                            .isDeleted = isDeleted});
    } else if (!isDeleted && listing.isWhole &&
               rows.vanished.size() + rows.crafted.size() >= MOST_VANISHED) {
      rows.areAll = false;
      break;
    } else if (!isDeleted && listing.isWhole) {
      (name.size() > LONGEST_NAME ? rows.crafted : rows.vanished).push_back(id);
    }
  }
  std::ranges::sort(rows.known, {}, [](const FolderRow& known) { return known.entry; });
  return rows;
}

std::vector<IndexedFolder> FolderIndexer::UpdateFolders(const IndexedFolder& folder,
                                                        const Listing& listing) {
  const FolderRows rows = ReadFolderRows(folder, listing);
  for (const long long id : rows.vanished) {
    std::string path;
    {
      db::Statement row(catalog_, "SELECT path FROM Folders WHERE id = ?");
      row.BindInt64(1, id);
      path = row.Fetch() ? row.GetText(0) : std::string();
    }
    if (path.ends_with('/')) {
      DeleteTree(path);
    }
    Pulse(0);
  }
  for (const long long id : rows.crafted) {
    MarkFolderDeleted(id); // what is below it cannot be reached then
    Pulse(0);
  }
  isFinished_ = rows.areAll;
  if (!isFinished_) {
    return {};
  }
  std::vector<IndexedFolder> folders;
  folders.reserve(listing.folders.size());
  auto row = rows.known.begin();
  for (const Entry& entry : listing.folders) {
    while (row != rows.known.end() && row->entry < &entry) {
      ++row; // in a damaged catalog, two rows may have one path
    }
    const FolderRow* const known =
        row != rows.known.end() && row->entry == &entry ? &*row : nullptr;
    if (entry.isKnown) {
      folders.push_back(UpdateFolder(folder, entry, known));
    }
    Pulse(folders.size());
  }
  return folders;
}

IndexedFolder FolderIndexer::UpdateFolder(const IndexedFolder& parent, const Entry& entry,
                                          const FolderRow* known) {
  ++summary_.folders;
  const Flags flags = FlagsOf(entry.name, parent.flags);
  if (known != nullptr && !known->isDeleted && known->folder.flags == flags &&
      known->folder.lastModifiedDate == entry.lastModifiedDate) {
    return known->folder;
  }
  hasVisibleChanges_ =
      hasVisibleChanges_ || known == nullptr || known->isDeleted || known->folder.flags != flags;
  db::Folder folder;
  folder.id = known != nullptr ? known->folder.id : nextFolderId_++;
  folder.folderId = parent.id;
  folder.path = parent.path + entry.name + '/';
  folder.name = entry.name;
  folder.category = FOLDER;
  folder.lastModifiedDate = entry.lastModifiedDate;
  folder.isBackup = flags.isBackup;
  folder.isHidden = flags.isHidden;
  folder.isSystem = flags.isSystem;
  folder.status = INDEXED;
  folder.lastUpdatedDate = Stamp();
  StoreFolder(catalog_, folder);
  return {.id = folder.id,
          .path = folder.path,
          .flags = flags,
          .lastModifiedDate = entry.lastModifiedDate,
          .revived = known != nullptr && known->isDeleted};
}

// --- Files in it -------------------------------------------------------------------------------

FolderIndexer::FileChanges FolderIndexer::CompareFiles(const IndexedFolder& folder,
                                                       const Listing& listing) {
  FileChanges changes;
  auto entry = listing.files.begin();
  const auto write = [&](const Entry& file, std::optional<FileRow> row) {
    if (file.isKnown &&
        (!hooks_.isComplete ||
         hooks_.isComplete(folder, file.name,
                           {.size = file.size, .statusChanged = file.access.changed}))) {
      changes.written.push_back({.entry = &file, .row = row});
      ++summary_.rows;
      return true;
    }
    return false;
  };
  const auto addBefore = [&](const std::string_view* name) {
    for (; entry != listing.files.end() && (name == nullptr || entry->name < *name); ++entry) {
      write(*entry, std::nullopt);
    }
  };

  db::Statement row(
      catalog_, "SELECT id, path, name, lastModifiedDate, size, isDeleted, status, category, "
                "isBackup, isHidden, isSystem, lastUpdatedDate FROM Files INDEXED BY Files_folder "
                "WHERE folderId = ? ORDER BY name");
  row.BindInt64(1, folder.id);
  RenditionAccess renditions(volume_, folder.path);
  std::vector<std::pair<const Entry*, long long>> tombstones;
  std::size_t count = 0;
  while (row.Fetch()) {
    Pulse(++count);
    const std::string_view path = row.GetTextView(1);
    const std::string_view name = row.GetTextView(2);
    if (!row.IsText(1) || !row.IsText(2)) {
      continue;
    }
    if (IsTombstone(path)) {
      const Entry* const file = FindName(listing.files, name);
      if (file != nullptr && IsJoined(path.substr(1), folder.path, name)) {
        tombstones.emplace_back(file, row.GetInt64(0));
      }
      continue;
    }
    if (!IsJoined(path, folder.path, name)) {
      continue;
    }
    addBefore(&name);
    const bool isThere = entry != listing.files.end() && entry->name == name;
    FileRow known{.id = row.GetInt64(0), .status = row.GetInt(6), .isDeleted = row.GetBool(5)};
    if (!isThere) {
      if (!known.isDeleted && listing.isWhole && changes.vanished.size() >= MOST_VANISHED) {
        isFinished_ = false;
      } else if (!known.isDeleted && listing.isWhole) {
        known.isPhoto = IsPhoto(name);
        changes.vanished.push_back(known);
      }
      continue;
    }
    const bool isDeleted = known.isDeleted;
    const bool isToBeRendered =
        newPhotos_ == NewPhotos::Waiting &&
        ((known.status == RENDERED && renditions.IsOutdated(known.id, entry->access)) ||
         (known.status == UNRENDERABLE && MayBeOpenedNow(row, *entry)) ||
         (known.status != INDEXED && hooks_.wasWritten && hooks_.wasWritten(folder, entry->name)));
    const bool isChanged =
        isDeleted || folder.revived || isToBeRendered || !IsUpToDate(row, folder, *entry);
    if (!(isChanged && write(*entry, known)) && !isDeleted) {
      ++summary_.rows; // it stays as it is
    }
    ++entry;
  }
  addBefore(nullptr);

  for (const auto& [file, id] : tombstones) {
    const auto change = std::ranges::lower_bound(
        changes.written, file->name, {},
        [](const FileChange& c) -> const auto& { return c.entry->name; });
    if (change != changes.written.end() && change->entry == file && change->row) {
      change->row->tombstone = id;
    }
  }
  for (const Entry& file : listing.files) {
    ++summary_.files;
    if (IsPhoto(file.name)) {
      ++summary_.photos;
    }
  }
  return changes;
}

bool FolderIndexer::IsUpToDate(const db::Statement& row, const IndexedFolder& folder,
                               const Entry& entry) const {
  const Flags flags = FlagsOf(entry.name, folder.flags);
  return row.GetTime(3) == entry.lastModifiedDate && row.GetInt64(4) == entry.size &&
         row.IsInteger(3) && row.IsInteger(4) &&
         row.GetInt(7) == CategoryOf(ExtensionOf(entry.name)) && row.GetBool(8) == flags.isBackup &&
         row.GetBool(9) == flags.isHidden && row.GetBool(10) == flags.isSystem;
}

/// Whether a photo that could not be opened has other permissions since. A ctime in the future says
/// nothing: it would be later than each failure.
bool FolderIndexer::MayBeOpenedNow(const db::Statement& row, const Entry& entry) const {
  const std::time_t changed = entry.access.changed.tv_sec;
  return changed >= row.GetTime(11) && changed <= now_ && WasNotOpened(catalog_, row.GetInt64(0));
}

void FolderIndexer::UpdateFile(const IndexedFolder& folder, const FileChange& change) {
  const Entry& entry = *change.entry;
  if (!change.row) {
    ++summary_.added;
  } else if (change.row->isDeleted) {
    ++summary_.revived;
  } else if (!folder.revived) {
    // When a folder was deleted, its files left the photo database, too. When it comes back, they
    // are written again although they have not changed.
    ++summary_.changed;
    summary_.linked += entry.isLinked ? 1 : 0;
  }
  const std::string extension = ExtensionOf(entry.name);
  const Category category = CategoryOf(extension);
  const Flags flags = FlagsOf(entry.name, folder.flags);
  const bool isFinished = category == PHOTO && newPhotos_ == NewPhotos::Finished;
  hasVisibleChanges_ = hasVisibleChanges_ || category == PHOTO;
  const long long id = change.row ? change.row->id : nextFileId_++;
  StoreFile(catalog_, catalog::FileRow{.id = id,
                                       .folderId = folder.id,
                                       .folderPath = folder.path,
                                       .name = entry.name,
                                       .category = category,
                                       .lastModifiedDate = entry.lastModifiedDate,
                                       .flags = flags,
                                       .status = isFinished ? RENDERED : INDEXED,
                                       .lastUpdatedDate = Stamp(),
                                       .extension = extension,
                                       .size = entry.size});
  if (change.row && change.row->status == UNRENDERABLE) {
    Execute(catalog_, "DELETE FROM Failures WHERE fileId = ?", id);
  }
  if (isFinished) {
    StoreTranscoding(catalog_, id, FINISHED, Stamp());
    if (change.row && change.row->tombstone != 0) {
      Execute(catalog_, "DELETE FROM Transcodings WHERE sourceId = ?", change.row->tombstone);
      Execute(catalog_, "DELETE FROM Files WHERE id = ?", change.row->tombstone);
    }
  }
}

// --- What is gone ------------------------------------------------------------------------------

void FolderIndexer::DeleteFile(const FileRow& file) {
  Execute(catalog_, "UPDATE Files SET isDeleted = 1, status = ?, lastUpdatedDate = ? WHERE id = ?",
          static_cast<int>(INDEXED), Stamp(), file.id);
  Execute(catalog_, "UPDATE Transcodings SET status = ?, lastUpdatedDate = ? WHERE sourceId = ?",
          static_cast<int>(WITHDRAWN), Stamp(), file.id);
  if (file.isPhoto) {
    hasVisibleChanges_ = true;
    Execute(catalog_, "INSERT OR IGNORE INTO Removals(fileId) VALUES(?)", file.id);
  }
  if (file.status == UNRENDERABLE) {
    Execute(catalog_, "DELETE FROM Failures WHERE fileId = ?", file.id);
  }
  ++summary_.deleted;
}

void FolderIndexer::MarkFolderDeleted(long long id) {
  hasVisibleChanges_ = true;
  Execute(catalog_, "UPDATE Folders SET isDeleted = 1, lastUpdatedDate = ? WHERE id = ?", Stamp(),
          id);
}

/// Marks a folder and all that is below it deleted. In parts: SQLite keeps the ids of rows that a
/// statement changes in memory.
void FolderIndexer::DeleteTree(const std::string& path) {
  constexpr int PART = 10'000;
  hasVisibleChanges_ = true;
  const std::string end = EndOfTree(path);
  for (std::string begin = path; begin < end;) {
    std::string next = end;
    {
      db::Statement row(catalog_, "SELECT path FROM Files WHERE path >= ? AND path < ? "
                                  "ORDER BY path LIMIT 1 OFFSET ?");
      row.BindText(1, begin);
      row.BindText(2, end);
      row.BindInt64(3, PART);
      if (row.Fetch() && row.IsText(0)) {
        next = row.GetText(0);
      }
    }
    DeleteFiles(begin, next);
    begin = std::move(next);
    Pulse(0);
  }
  Execute(catalog_,
          "UPDATE Folders SET isDeleted = 1, lastUpdatedDate = ? "
          "WHERE path >= ? AND path < ? AND isDeleted = 0",
          Stamp(), path, end);
}

/// Marks the files with paths from `begin` to before `end` deleted.
void FolderIndexer::DeleteFiles(const std::string& begin, const std::string& end) {
  summary_.deleted += SelectNumber(
      catalog_, "SELECT count(*) FROM Files WHERE path >= ? AND path < ? AND isDeleted = 0", begin,
      end);
  Execute(catalog_,
          "UPDATE Transcodings SET status = ?, lastUpdatedDate = ? WHERE sourceId IN "
          "(SELECT id FROM Files WHERE path >= ? AND path < ? AND isDeleted = 0)",
          static_cast<int>(WITHDRAWN), Stamp(), begin, end);
  Execute(catalog_,
          "INSERT OR IGNORE INTO Removals(fileId) SELECT id FROM Files "
          "WHERE path >= ? AND path < ? AND isDeleted = 0 AND category = 3",
          begin, end);
  Execute(catalog_,
          "DELETE FROM Failures WHERE fileId IN "
          "(SELECT id FROM Files WHERE path >= ? AND path < ? AND isDeleted = 0 AND status = 2)",
          begin, end);
  Execute(catalog_,
          "UPDATE Files SET isDeleted = 1, status = ?, lastUpdatedDate = ? "
          "WHERE path >= ? AND path < ? AND isDeleted = 0",
          static_cast<int>(INDEXED), Stamp(), begin, end);
}

long long FolderIndexer::DeleteUnreachableRows(long long folders, long long files) {
  constexpr char COUNT_FILES[] = "SELECT count(*) FROM Files WHERE isDeleted = 0";
  if (SelectNumber(catalog_, "SELECT count(*) FROM Folders WHERE isDeleted = 0") != folders) {
    DeleteUnreachableFolders();
  }
  const long long rows = SelectNumber(catalog_, COUNT_FILES);
  if (rows == files) {
    return rows;
  }
  DeleteUnreachableFiles();
  CheckIndexes(catalog_);
  return SelectNumber(catalog_, COUNT_FILES);
}

// A folder is reachable exactly if its path is that of its folder and its name, and this holds for
// the folder, too. A path is longer than that of its folder, so there is no cycle.
void FolderIndexer::DeleteUnreachableFolders() {
  // Below a folder that is marked deleted here, others may have become unreachable.
  for (bool found = true; found;) {
    found = false;
    std::vector<long long> ids;
    ForEachRow(catalog_,
               "SELECT f.id, f.path FROM Folders f "
               "LEFT JOIN Folders p ON p.id = f.folderId AND p.isDeleted = 0 "
               "WHERE f.isDeleted = 0 AND (typeof(f.path) <> 'text' OR typeof(f.name) <> 'text' "
               "OR CASE WHEN f.folderId = -1 THEN f.path <> f.name || '/' "
               "ELSE p.id IS NULL OR f.path <> p.path || f.name || '/' END)",
               [&](const db::Statement& row) {
                 Pulse(0);
                 if (!IsLeftAlone(row.GetText(1))) {
                   ids.push_back(row.GetInt64(0));
                 }
               });
    for (const long long id : ids) {
      Pulse(0);
      MarkFolderDeleted(id);
      found = true;
    }
  }
}

void FolderIndexer::DeleteUnreachableFiles() {
  std::vector<FileRow> files;
  ForEachRow(catalog_,
             "SELECT f.id, f.path, f.name, f.status FROM Files f "
             "LEFT JOIN Folders p ON p.id = f.folderId AND p.isDeleted = 0 "
             "WHERE f.isDeleted = 0 AND (typeof(f.path) <> 'text' OR typeof(f.name) <> 'text' "
             "OR CASE WHEN f.folderId = -1 THEN f.path <> f.name "
             "ELSE p.id IS NULL OR f.path <> p.path || f.name END)",
             [&](const db::Statement& row) {
               Pulse(0);
               if (!IsLeftAlone(row.GetText(1))) {
                 files.push_back({.id = row.GetInt64(0),
                                  .status = row.GetInt(3),
                                  .isPhoto = IsPhoto(row.GetTextView(2))});
               }
             });
  for (const FileRow& file : files) {
    Pulse(0);
    DeleteFile(file);
  }
}

void FolderIndexer::LeaveAlone(const std::string& path, const std::string& reason) {
  const std::string message = util::MakePath(volume_.Path(), path) + ": " + reason;
  if (path.empty()) {
    throw util::Exception(message);
  }
  summary_.unreadable.push_back(message);
  leftAlone_.push_back(path.ends_with('/') ? path.substr(0, path.size() - 1) : path);
}

bool FolderIndexer::IsLeftAlone(const std::string& path) const {
  return std::ranges::any_of(leftAlone_, [&path](const std::string& prefix) {
    return path.starts_with(prefix) && (path.size() == prefix.size() || path[prefix.size()] == '/');
  });
}

} // namespace orva::catalog
