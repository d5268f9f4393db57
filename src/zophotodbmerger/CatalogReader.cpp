#include "stdafx.h"

#include "CatalogReader.h"

#include "FolderItemCmp.h"

#include "orvadb/ErrorMessage.h"
#include "orvadb/File.h"
#include "orvadb/Folder.h"
#include "orvadb/Statement.h"
#include "orvadb/VolumeDB.h"

#include "orvautil/FormatString.h"
#include "orvautil/Path.h"

#include <unistd.h>

#include <algorithm>

namespace orva::dbmerger {

namespace {

using db::Statement;

constexpr int ROOT_FOLDER_CATEGORY = 4;
constexpr long long TRANSCODED = 3;

/// A quarter of the machine's memory.
long long MostMemory() {
  return sysconf(_SC_PHYS_PAGES) / 4 * sysconf(_SC_PAGESIZE);
}

/// The memory that a list may take: in a crafted catalog a few pages may produce any number of
/// rows.
class ListMemory {
public:
  explicit ListMemory(const db::VolumeDB& catalog) : catalog_(catalog) {}

  /// Takes the bytes of one more item. Throws std::string when that is more than the content can
  /// need that was read, or more than the machine can spare.
  void Take(std::size_t bytes) {
    taken_ += static_cast<long long>(bytes);
    if (taken_ > limit_) {
      static const long long most = MostMemory();
      limit_ = std::min(LEAST + PER_BYTE * catalog_.BytesRead(), most);
    }
    if (taken_ > limit_) {
      throw db::ErrorMessage(util::FormatString(
          "'%s' has more rows than a file of its size can hold", catalog_.GetPath().c_str()));
    }
  }

private:
  // Twice what the smallest row takes in memory for each of its bytes in the file.
  static constexpr long long PER_BYTE = 20;
  static constexpr long long LEAST = 1 << 20;

  const db::VolumeDB& catalog_;
  long long taken_ = 0;
  long long limit_ = LEAST; ///< raised when it is reached
};

/// Calls `use` with each visible folder of the catalog.
template <typename Use>
void ForEachFolder(const db::VolumeDB& catalog, Use use) {
  catalog.RejectComputedColumns("Folders");
  // The unary plus here and below keeps SQLite from using an index on a flag.
  Statement query(catalog,
                  "SELECT * FROM Folders where +isSystem = 0 AND +isBackup = 0 AND +isHidden = 0");
  while (query.Step() == Statement::ROW) {
    use(query);
  }
}

/// Calls `use` with each file whose rendition was finished or withdrawn after `since`.
template <typename Use>
void ForEachChangedFile(const db::VolumeDB& catalog, std::time_t since, Use use) {
  catalog.RejectComputedColumns("Files");
  catalog.RejectComputedColumns("Transcodings");
  Statement query(catalog,
                  "SELECT f.id,f.folderId,f.path,f.name,f.category,f.lastModifiedDate,f.isBackup,"
                  "f.isHidden,f.isSystem,f.isDeleted,f.status,t.lastUpdatedDate,f.ext,f.size from "
                  "Files f, Transcodings t WHERE f.id = t.sourceId AND t.lastUpdatedDate > ? AND "
                  "t.profile = 'cb62bbdd389b48898f2e5244977cb2c5' AND ((f.isDeleted = 0 and "
                  "t.status = 1) OR (f.isDeleted = 1 and t.status = 0))");
  query.BindTime(1, since);
  while (query.Step() == Statement::ROW) {
    use(query);
  }
}

/// The row for the volume itself, which is not in its catalog.
std::unique_ptr<db::Folder> RootFolder(const std::string& volumeMountPoint) {
  auto folder = std::make_unique<db::Folder>();
  folder->path = volumeMountPoint;
  folder->category = ROOT_FOLDER_CATEGORY;
  folder->lastUpdatedDate = -1;
  return folder;
}

/// Reads the columns that folders and files have in common. Their times are 32-bit integers for
/// every program of the appliance.
template <typename Item>
std::unique_ptr<Item> ReadItem(const Statement& row, const std::string& base) {
  auto item = std::make_unique<Item>();
  item->id = row.GetInt64(0);
  item->folderId = row.GetInt64(1);
  item->path = util::MakePath(base, row.GetTextView(2));
  item->name = row.GetTextView(3);
  item->category = row.GetInt(4);
  item->lastModifiedDate = row.GetInt(5);
  item->isBackup = row.GetBool(6);
  item->isHidden = row.GetBool(7);
  item->isSystem = row.GetBool(8);
  item->isDeleted = row.GetBool(9);
  item->status = row.GetInt(10);
  item->lastUpdatedDate = row.GetInt(11);
  return item;
}

/// Bytes that a merge takes for an item beyond the list, at most.
constexpr std::size_t MERGE_BYTES = 128;

/// Builds the full paths of a catalog's rows, as util::MakePath does.
class MergeListReader {
public:
  MergeListReader(const std::string& volumeMountPoint, const db::VolumeDB& catalog)
      : base_(util::MakePath(util::Path(volumeMountPoint).Basic(), "")), memory_(catalog) {}

  /// Adds a row to the list, as an item with `name`. Its columns are those that folders and files
  /// have in common.
  void Add(const Statement& row, std::string_view name) {
    std::string_view path = row.GetTextView(2);
    if (!base_.empty()) {
      path.remove_prefix(std::min(path.find_first_not_of('/'), path.size()));
    }
    memory_.Take(sizeof(MergeItem) + MERGE_BYTES + base_.size() + path.size() + name.size());
    MergeItem& item = list_.Add(base_, path, name);
    item.modified = row.GetInt(5);
    item.isSystem = row.GetBool(8);
    item.isDeleted = row.GetBool(9);
    item.status = row.GetInt(10);
    item.updated = row.GetInt(11);
  }

  /// The list, sorted.
  MergeList Take() {
    list_.Sort();
    return std::move(list_);
  }

  MergeList& List() noexcept { return list_; }

private:
  std::string base_;
  ListMemory memory_;
  MergeList list_;
};

} // namespace

util::OwnerVector<db::Folder> ReadFolders(const std::string& volumeMountPoint,
                                          const db::VolumeDB& catalog) {
  ListMemory memory(catalog);
  util::OwnerVector<db::Folder> folders;
  folders.push_back(RootFolder(volumeMountPoint));
  const std::string base = util::Path(volumeMountPoint).Basic();
  ForEachFolder(catalog, [&](const Statement& row) {
    auto folder = ReadItem<db::Folder>(row, base);
    memory.Take(sizeof(db::Folder) + folder->path.size() + folder->name.size());
    folders.push_back(std::move(folder));
  });
  std::ranges::sort(folders, FolderItemCmp<db::FolderItem>());
  return folders;
}

util::OwnerVector<db::File> ReadChangedFiles(const std::string& volumeMountPoint,
                                             const db::VolumeDB& catalog, std::time_t since) {
  ListMemory memory(catalog);
  util::OwnerVector<db::File> files;
  const std::string base = util::Path(volumeMountPoint).Basic();
  ForEachChangedFile(catalog, since, [&](const Statement& row) {
    auto file = ReadItem<db::File>(row, base);
    file->ext = row.GetTextView(12);
    file->size = row.GetInt64(13);
    memory.Take(sizeof(db::File) + file->path.size() + file->name.size() + file->ext.size());
    files.push_back(std::move(file));
  });
  std::ranges::sort(files, FolderItemCmp<db::FolderItem>());
  return files;
}

MergeList ListFolders(const std::string& volumeMountPoint, const db::VolumeDB& catalog) {
  MergeListReader reader(volumeMountPoint, catalog);
  reader.List().Add({}, volumeMountPoint, {});
  ForEachFolder(catalog, [&](const Statement& row) { reader.Add(row, {}); });
  return reader.Take();
}

MergeList ListChangedFiles(const std::string& volumeMountPoint, const db::VolumeDB& catalog,
                           std::time_t since) {
  MergeListReader reader(volumeMountPoint, catalog);
  ForEachChangedFile(catalog, since,
                     [&](const Statement& row) { reader.Add(row, row.GetTextView(3)); });
  return reader.Take();
}

PhotoCounts CountPhotos(const std::string& /*volumeMountPoint*/, const db::VolumeDB& catalog) {
  catalog.RejectComputedColumns("Files");
  PhotoCounts counts;
  {
    Statement query(catalog,
                    "SELECT count(*) FROM Files WHERE category = 3 AND status = ? AND +isSystem = "
                    "0 AND +isBackup = 0 AND +isHidden = 0 AND +isDeleted = 0");
    query.BindInt64(1, TRANSCODED);
    if (query.Step() == Statement::ROW) {
      counts.transcoded = query.GetInt(0);
    }
  }
  Statement query(catalog,
                  "SELECT count(*) FROM Files WHERE category = 3 AND +isSystem = 0 AND +isBackup "
                  "= 0 AND +isHidden = 0 AND +isDeleted = 0");
  if (query.Step() == Statement::ROW) {
    counts.total = query.GetInt(0);
  }
  return counts;
}

} // namespace orva::dbmerger
