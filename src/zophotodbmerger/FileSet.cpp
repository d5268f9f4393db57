#include "stdafx.h"

#include "FileSet.h"

#include "FolderFinder.h"
#include "NameFinder.h"
#include "PhotoDB.h"
#include "StandardOutput.h"

#include "orvadb/ErrorMessage.h"
#include "orvadb/Rows.h"
#include "orvadb/Statement.h"

#include <algorithm>
#include <tuple>

namespace orva::dbmerger {

using db::Statement;

/// The additions of a set as rows. Takes the id of each row after it was inserted.
class FileSet::AdditionRows final : public db::Rows {
public:
  explicit AdditionRows(FileSet& set) : set_(set) {}

  bool Next() noexcept override {
    if (next_ != 0 && !set_.addedIds_.empty()) {
      set_.addedIds_[set_.entries_[set_.additions_[next_ - 1]].name] = set_.photos_.LastInsertId();
    }
    return next_++ != set_.additions_.size();
  }

  Value Get(Column column) const noexcept override {
    const Index file = set_.additions_[next_ - 1];
    switch (column) {
    case ID:
      return set_.groups_[set_.entries_[file].group].target;
    case NAME:
      return set_.files_[file].Name();
    case TIME:
      return static_cast<long long>(set_.files_[file].modified);
    }
    return 0LL;
  }

private:
  FileSet& set_;
  std::size_t next_ = 0;
};

FileSet::FileSet(const PhotoDB& photos, const std::string& volume,
                 const std::atomic<bool>& stopRequested)
    : photos_(photos), volume_(volume), stopRequested_(stopRequested),
      output_(StandardOutput::Current()) {}

std::time_t FileSet::Apply(std::span<const MergeItem> files, std::time_t since) {
  if (files.empty() || stopRequested_) {
    return since;
  }
  if (files.size() >= NONE) {
    throw db::ErrorMessage("too many files");
  }
  const FlushAtEnd flush(output_);
  files_ = files;
  entries_.assign(files.size(), {});
  additions_.reserve(files.size());
  if (std::ranges::any_of(files, &MergeItem::isDeleted)) {
    addedIds_.assign(files.size(), 0);
  }
  MakeGroups();
  FindFolders();
  SortByGroup();
  {
    NameFinder finder(photos_, volume_);
    for (const Group& group : groups_) {
      if (stopRequested_) {
        return since;
      }
      NameFiles(group);
      FindFiles(group, finder);
    }
  }

  std::time_t newest = since;
  for (Index file = 0; file < files_.size() && !stopRequested_; ++file) {
    if (!output_.IsNull()) {
      WriteLines(file);
    }
    if (files_[file].isSystem) {
      continue;
    }
    if (files_[file].isDeleted) {
      Remove(file);
    } else {
      Add(file);
    }
    newest = std::max<std::time_t>(newest, files_[file].updated);
  }
  Flush();
  return newest;
}

// Files come in the order of their paths: those between two files of a folder are below it.
void FileSet::MakeGroups() {
  std::vector<Index> open; // groups whose paths are the beginning of the current one
  for (Index file = 0; file < files_.size(); ++file) {
    if (files_[file].isSystem) {
      continue;
    }
    const std::string_view path = FolderPath(files_[file].Path());
    while (!open.empty() && !path.starts_with(groups_[open.back()].path)) {
      open.pop_back();
    }
    if (open.empty() || groups_[open.back()].path.size() != path.size()) {
      open.push_back(static_cast<Index>(groups_.size()));
      groups_.push_back({.path = path});
    }
    entries_[file].group = open.back();
  }
}

void FileSet::FindFolders() {
  {
    FolderFinder finder(photos_);
    for (Group& group : groups_) {
      FindFoldersOf(group, finder);
    }
  }
  for (Index file = 0; file < files_.size(); ++file) {
    Entry& entry = entries_[file];
    if (entry.group == NONE) {
      continue;
    }
    const Group& group = groups_[entry.group];
    if (files_[file].isDeleted) {
      entry.isSourceFound = group.folderCount != 0;
      if (group.source == NO_FOLDER) {
        entry.group = GroupWithoutFolder();
      }
    } else if (group.target == NO_FOLDER) {
      entry.group = NONE;
    }
  }
}

void FileSet::FindFoldersOf(Group& group, FolderFinder& finder) {
  const std::span<const long long> ids = finder.Find(group.path);
  group.source = ids.empty() ? NO_FOLDER : ids.front();
  if (ids.size() <= 1) {
    group.target = !ids.empty() && finder.IsOn(volume_) ? ids.front() : NO_FOLDER;
  } else {
    group.target = photos_.FindFolder(group.path, volume_).value_or(NO_FOLDER);
  }
  group.firstFolder = static_cast<Index>(folderIds_.size());
  group.folderCount = static_cast<Index>(ids.size());
  folderIds_.insert(folderIds_.end(), ids.begin(), ids.end());
  if (std::ranges::find(ids, NO_FOLDER) != ids.end()) {
    groupOfNoFolder_ = static_cast<Index>(&group - groups_.data());
  }
}

FileSet::Index FileSet::GroupWithoutFolder() {
  if (groupWithoutFolder_ == NONE) {
    groupWithoutFolder_ = static_cast<Index>(groups_.size());
    groups_.push_back({.target = NO_FOLDER,
                       .source = NO_FOLDER,
                       .firstFolder = static_cast<Index>(folderIds_.size()),
                       .folderCount = 1});
    folderIds_.push_back(NO_FOLDER);
  }
  return groupWithoutFolder_;
}

// A counting sort: the files of a group stay in the order of the list.
void FileSet::SortByGroup() {
  for (const Entry& entry : entries_) {
    if (entry.group != NONE) {
      ++groups_[entry.group].end;
    }
  }
  Index begin = 0;
  for (Group& group : groups_) {
    group.begin = begin;
    begin += group.end;
    group.end = group.begin;
  }
  byGroup_.resize(begin);
  for (Index file = 0; file < files_.size(); ++file) {
    if (entries_[file].group != NONE) {
      byGroup_[groups_[entries_[file].group].end++] = file;
    }
  }
}

void FileSet::NameFiles(const Group& group) {
  const std::span<Index> files(byGroup_.begin() + group.begin, byGroup_.begin() + group.end);
  const auto name = [this](Index file) { return files_[file].Name(); };
  if (!std::ranges::is_sorted(files, {}, name)) {
    std::ranges::sort(files, {}, [&](Index file) { return std::tuple(name(file), file); });
  }
  Index first = NONE;
  for (const Index file : files) {
    if (first == NONE || name(first) != name(file)) {
      first = file;
    }
    entries_[file].name = first;
  }
}

void FileSet::FindFiles(const Group& group, NameFinder& finder) {
  std::vector<std::string_view> names;
  std::vector<Index> files;
  for (Index i = group.begin; i < group.end; ++i) {
    if (entries_[byGroup_[i]].name == byGroup_[i]) {
      names.push_back(files_[byGroup_[i]].Name());
      files.push_back(byGroup_[i]);
    }
  }
  const std::span<const long long> folderIds(folderIds_.begin() + group.firstFolder,
                                             group.folderCount);
  for (const FoundFile& found : finder.Find(names, folderIds)) {
    Entry& name = entries_[files[found.name]];
    found_.push_back(
        {.id = found.id, .folderId = found.folderId, .isOwn = found.isOwn, .next = name.found});
    name.found = static_cast<Index>(found_.size() - 1);
    name.ownCount += found.isOwn ? 1 : 0;
  }
}

void FileSet::WriteLines(Index file) const {
  const MergeItem& item = files_[file];
  output_.WriteLine({"Processing file ", item.Path(), " isdeleted=", item.isDeleted ? "1" : "0",
                     " status = ", std::to_string(item.status)});
  if (item.isSystem) {
    return;
  }
  if (!item.isDeleted) {
    output_.WriteLine({"Adding file ", item.Path(), " for mount ", volume_});
    return;
  }
  output_.WriteLine({"Removing file ", item.Path(), " for mount ", volume_});
  output_.WriteLine({"Deleting ", item.Path()});
  if (entries_[file].isSourceFound) {
    output_.WriteLine({"Found parent folder ", std::to_string(groups_[entries_[file].group].source),
                       " for ", item.Path()});
  }
}

void FileSet::Add(Index file) {
  if (entries_[file].group == NONE) {
    return;
  }
  Entry& name = entries_[entries_[file].name];
  if (name.isAdded || name.ownCount != 0) {
    return;
  }
  if (!removals_.empty()) {
    Flush();
  }
  name.isAdded = true;
  additions_.push_back(file);
}

void FileSet::Remove(Index file) {
  const Index first = entries_[file].name;
  Entry& name = entries_[first];
  const Group& group = groups_[name.group];
  idsToRemove_.clear();
  if (name.isAdded && group.source == group.target) {
    Flush(); // gives it its id
    idsToRemove_.push_back(addedIds_[first]);
    name.isAdded = false;
  }
  if (!name.isSourceTaken) {
    TakeFound(name, group.source);
    name.isSourceTaken = true;
  }
  if (idsToRemove_.empty()) {
    return;
  }
  if (!additions_.empty()) {
    Flush();
  }
  removals_.insert(removals_.end(), idsToRemove_.begin(), idsToRemove_.end());
  if (name.group == groupWithoutFolder_ && groupOfNoFolder_ != NONE) {
    TakeFromNoFolder(files_[file].Name());
  }
}

// Moves the files that were found in the folder from the entry to idsToRemove_.
void FileSet::TakeFound(Entry& name, long long folderId) {
  Index* link = &name.found;
  while (*link != NONE) {
    const Found& found = found_[*link];
    if (found.folderId == folderId) {
      idsToRemove_.push_back(found.id);
      name.ownCount -= found.isOwn ? 1 : 0;
      *link = found.next;
    } else {
      link = &found_[*link].next;
    }
  }
}

void FileSet::TakeFromNoFolder(std::string_view name) {
  const Group& home = groups_[groupOfNoFolder_];
  const std::span<const Index> files(byGroup_.begin() + home.begin, byGroup_.begin() + home.end);
  const auto found =
      std::ranges::lower_bound(files, name, {}, [this](Index file) { return files_[file].Name(); });
  if (found != files.end() && files_[*found].Name() == name) {
    TakeFound(entries_[*found], NO_FOLDER);
  }
}

void FileSet::Flush() {
  output_.Flush();
  if (!additions_.empty()) {
    AdditionRows rows(*this);
    // For readers a photo was created when it was last modified.
    Statement insert(photos_,
                     "INSERT INTO Files(folder_id, name, modified_date, volume, created_date) "
                     "SELECT id, name, time, ?, time FROM temp.input",
                     rows);
    insert.BindTextView(1, volume_);
    insert.Execute();
    additions_.clear();
  }
  if (!removals_.empty()) {
    DeleteFiles();
    removals_.clear();
  }
}

// Files that were added together have consecutive ids. SQLite deletes a range of them faster than a
// set, which it collects first.
void FileSet::DeleteFiles() {
  std::ranges::sort(removals_);
  auto begin = removals_.begin();
  while (begin != removals_.end()) {
    const auto last = std::adjacent_find(
        begin, removals_.end(), [](long long id, long long next) { return next != id + 1; });
    const auto end = last == removals_.end() ? last : std::next(last);
    Statement change(photos_, "DELETE FROM Files WHERE file_id BETWEEN ? AND ?");
    change.BindInt64(1, *begin);
    change.BindInt64(2, *std::prev(end));
    change.Execute();
    begin = end;
  }
}

} // namespace orva::dbmerger
