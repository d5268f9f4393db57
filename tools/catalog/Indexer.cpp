#include "Indexer.h"

#include "CatalogSchema.h"
#include "CatalogWriter.h"
#include "Sql.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"
#include "orvadb/Transaction.h"

#include "orvautil/Core.h"
#include "orvautil/Exception.h"
#include "orvautil/Path.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <system_error>
#include <utility>

namespace orva::catalog {
namespace {

/// True for the product's own folders in the root of a volume, which are not indexed.
bool IsProductData(const std::string& path) {
  return path == core::GetORVA_HOME("") || path == ".zophotos";
}

} // namespace

Indexer::Indexer(const db::DB& catalog, std::string mountPoint, std::time_t now, Progress progress)
    : catalog_(catalog), mountPoint_(std::move(mountPoint)), now_(now),
      progress_(std::move(progress)) {}

IndexSummary Indexer::Run() {
  db::Transaction transaction(catalog_, BUSY_TIMEOUT);
  stamp_ = NextStamp(catalog_, now_);
  LoadRows();
  Visit(Place());
  DeleteVanished();
  transaction.Commit();
  return summary_;
}

void Indexer::LoadRows() {
  ForEachRow(catalog_, "SELECT path, id, lastModifiedDate, isDeleted FROM Folders",
             [this](const db::Statement& row) {
               folders_.emplace(row.GetText(0), KnownFolder{.id = row.GetInt64(1),
                                                            .lastModifiedDate = row.GetTime(2),
                                                            .isDeleted = row.GetBool(3)});
               nextFolderId_ = std::max(nextFolderId_, row.GetInt64(1) + 1);
             });
  ForEachRow(catalog_, "SELECT path, id, lastModifiedDate, size, isDeleted FROM Files",
             [this](const db::Statement& row) {
               files_.emplace(row.GetText(0), KnownFile{.id = row.GetInt64(1),
                                                        .lastModifiedDate = row.GetTime(2),
                                                        .size = row.GetInt64(3),
                                                        .isDeleted = row.GetBool(4)});
               nextFileId_ = std::max(nextFileId_, row.GetInt64(1) + 1);
             });
}

void Indexer::Visit(const Place& place) {
  for (const Entry& entry : List(place)) {
    if (entry.isFolder) {
      Visit(UpdateFolder(place, entry));
    } else {
      UpdateFile(place, entry);
    }
  }
  if (progress_) {
    progress_(summary_);
  }
}

std::vector<Indexer::Entry> Indexer::List(const Place& place) {
  std::vector<Entry> entries;
  std::error_code error;
  std::filesystem::directory_iterator iterator(util::MakePath(mountPoint_, place.path), error);
  while (!error && iterator != std::filesystem::directory_iterator()) {
    const std::string name = iterator->path().filename().native();
    if (!IsProductData(place.path + name)) {
      Examine(place.path + name, name, entries);
    }
    iterator.increment(error);
  }
  // A folder may disappear during the run, with all that was in it; the volume must not.
  if (error && (error.value() != ENOENT || place.path.empty())) {
    LeaveAlone(place.path, error.message());
  }

  std::ranges::sort(entries, {}, &Entry::name);
  return entries;
}

void Indexer::Examine(const std::string& path, const std::string& name,
                      std::vector<Entry>& entries) {
  struct stat found = {};
  if (lstat(util::MakePath(mountPoint_, path).c_str(), &found) != 0) {
    if (errno != ENOENT) {
      LeaveAlone(path, std::generic_category().message(errno));
    }
  } else if (S_ISDIR(found.st_mode) || S_ISREG(found.st_mode)) {
    entries.push_back({.name = name,
                       .isFolder = S_ISDIR(found.st_mode),
                       .lastModifiedDate = found.st_mtime,
                       .size = found.st_size});
  }
}

Indexer::Place Indexer::UpdateFolder(const Place& parent, const Entry& entry) {
  Place place{.path = parent.path + entry.name + '/', .flags = FlagsOf(entry.name, parent.flags)};
  ++summary_.folders;

  const auto [position, isNew] = folders_.try_emplace(
      place.path, KnownFolder{.id = nextFolderId_, .lastModifiedDate = entry.lastModifiedDate});
  KnownFolder& known = position->second;
  known.seen = true;
  place.id = known.id;
  place.revived = known.isDeleted;
  if (isNew) {
    ++nextFolderId_;
  } else if (!known.isDeleted && known.lastModifiedDate == entry.lastModifiedDate) {
    return place;
  }

  db::Folder folder;
  folder.id = place.id;
  folder.folderId = parent.id;
  folder.path = place.path;
  folder.name = entry.name;
  folder.category = FOLDER;
  folder.lastModifiedDate = entry.lastModifiedDate;
  folder.isBackup = place.flags.isBackup;
  folder.isHidden = place.flags.isHidden;
  folder.isSystem = place.flags.isSystem;
  folder.status = INDEXED;
  folder.lastUpdatedDate = stamp_;
  StoreFolder(catalog_, folder);
  return place;
}

void Indexer::UpdateFile(const Place& folder, const Entry& entry) {
  db::File file;
  file.path = folder.path + entry.name;
  file.ext = ExtensionOf(entry.name);
  file.category = CategoryOf(file.ext);
  ++summary_.files;
  if (file.category == PHOTO) {
    ++summary_.photos;
  }

  const auto [position, isNew] = files_.try_emplace(
      file.path,
      KnownFile{.id = nextFileId_, .lastModifiedDate = entry.lastModifiedDate, .size = entry.size});
  KnownFile& known = position->second;
  known.seen = true;
  if (isNew) {
    ++nextFileId_;
    ++summary_.added;
  } else if (known.isDeleted) {
    ++summary_.revived;
  } else if (known.lastModifiedDate != entry.lastModifiedDate || known.size != entry.size) {
    ++summary_.changed;
  } else if (!folder.revived) {
    // When a folder was deleted, its files left the photo database, too. When it comes back, they
    // are written again although they have not changed.
    return;
  }

  const Flags flags = FlagsOf(entry.name, folder.flags);
  file.id = known.id;
  file.folderId = folder.id;
  file.name = entry.name;
  file.lastModifiedDate = entry.lastModifiedDate;
  file.isBackup = flags.isBackup;
  file.isHidden = flags.isHidden;
  file.isSystem = flags.isSystem;
  file.status = file.category == PHOTO ? RENDERED : INDEXED;
  file.lastUpdatedDate = stamp_;
  file.size = entry.size;
  StoreFile(catalog_, file);
  if (file.category == PHOTO) {
    StoreTranscoding(catalog_, file.id, FINISHED, stamp_);
  }
}

void Indexer::DeleteVanished() {
  for (const auto& [path, folder] : folders_) {
    if (folder.seen || folder.isDeleted || IsLeftAlone(path)) {
      continue;
    }
    Execute(catalog_, "UPDATE Folders SET isDeleted = 1, lastUpdatedDate = ? WHERE id = ?", stamp_,
            folder.id);
  }
  for (const auto& [path, file] : files_) {
    if (file.seen || file.isDeleted || IsLeftAlone(path)) {
      continue;
    }
    Execute(catalog_,
            "UPDATE Files SET isDeleted = 1, status = ?, lastUpdatedDate = ? WHERE id = ?",
            static_cast<int>(INDEXED), stamp_, file.id);
    Execute(catalog_, "UPDATE Transcodings SET status = ?, lastUpdatedDate = ? WHERE sourceId = ?",
            static_cast<int>(WITHDRAWN), stamp_, file.id);
    ++summary_.deleted;
  }
}

void Indexer::LeaveAlone(const std::string& path, const std::string& reason) {
  const std::string message = util::MakePath(mountPoint_, path) + ": " + reason;
  if (path.empty()) {
    throw util::Exception(message);
  }
  summary_.unreadable.push_back(message);
  leftAlone_.push_back(path.ends_with('/') ? path.substr(0, path.size() - 1) : path);
}

bool Indexer::IsLeftAlone(const std::string& path) const {
  return std::ranges::any_of(leftAlone_, [&path](const std::string& prefix) {
    return path.starts_with(prefix) && (path.size() == prefix.size() || path[prefix.size()] == '/');
  });
}

} // namespace orva::catalog
