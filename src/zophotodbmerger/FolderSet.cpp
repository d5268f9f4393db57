#include "stdafx.h"

#include "FolderSet.h"

#include "PhotoDB.h"
#include "StandardOutput.h"

#include "orvadb/Rows.h"
#include "orvadb/Statement.h"

#include <algorithm>
#include <array>

namespace orva::dbmerger {

namespace {

using db::Statement;

/// Ids as rows.
class IdRows final : public db::Rows {
public:
  explicit IdRows(std::span<const long long> ids) : ids_(ids) {}

  bool Next() noexcept override { return next_++ != ids_.size(); }
  Value Get(Column /*column*/) const noexcept override { return ids_[next_ - 1]; }

private:
  std::span<const long long> ids_;
  std::size_t next_ = 0;
};

} // namespace

/// The additions of a set as rows. Takes the id of each row after it was inserted: the rows after
/// it may be its subfolders.
class FolderSet::AdditionRows final : public db::Rows {
public:
  AdditionRows(const PhotoDB& photos, std::vector<Addition>& additions)
      : photos_(photos), additions_(additions) {}

  bool Next() noexcept override {
    if (next_ != 0) {
      additions_[next_ - 1].id = photos_.LastInsertId();
    }
    return next_++ != additions_.size();
  }

  Value Get(Column column) const noexcept override {
    const Addition& addition = additions_[next_ - 1];
    switch (column) {
    case ID:
      return addition.parent == NONE ? addition.parentId : additions_[addition.parent].id;
    case NAME:
      return addition.folder->Path();
    case TIME:
      return static_cast<long long>(addition.folder->modified);
    }
    return 0LL;
  }

private:
  const PhotoDB& photos_;
  std::vector<Addition>& additions_;
  std::size_t next_ = 0;
};

std::optional<long long>
FolderSet::Candidates::FirstLeft(const std::unordered_set<long long>& removed) {
  while (next_ < ids_.size() && removed.contains(ids_[next_])) {
    ++next_;
  }
  return next_ < ids_.size() ? std::optional(ids_[next_]) : std::nullopt;
}

FolderSet::FolderSet(const PhotoDB& photos, const std::string& volume,
                     const std::atomic<bool>& stopRequested)
    : photos_(photos), volume_(volume), stopRequested_(stopRequested),
      output_(StandardOutput::Current()), finder_(photos) {}

void FolderSet::Apply(std::span<const MergeItem> folders) {
  const FlushAtEnd flush(output_);
  while (!folders.empty() && !stopRequested_) {
    const auto end = std::ranges::find_if(
        folders, [&](const MergeItem& folder) { return folder.Path() != folders.front().Path(); });
    const auto count = static_cast<std::size_t>(end - folders.begin());
    ApplyPath(folders.first(count));
    folders = folders.subspan(count);
  }
  Flush();
}

void FolderSet::ApplyPath(std::span<const MergeItem> folders) {
  const std::string_view path = folders.front().Path();
  while (!ancestors_.empty() && !path.starts_with(ancestors_.back().path)) {
    ancestors_.pop_back();
  }
  removed_ = std::unordered_set<long long>(); // clear() would keep its buckets
  if (isNoFolderRemoved_) {
    removed_.insert(NO_FOLDER);
  }
  const std::span<const long long> ids = finder_.Find(path);
  any_.Reset(ids);
  if (ids.size() > 1 && std::ranges::any_of(folders, &MergeItem::isDeleted)) {
    FindOwn(path);
  } else {
    own_.Reset(finder_.IsOn(volume_) ? ids : std::span<const long long>());
  }
  addition_ = NONE;
  for (const MergeItem& folder : folders) {
    if (stopRequested_) {
      return;
    }
    if (folder.isDeleted) {
      Remove(folder);
    } else {
      Add(folder);
    }
  }
  ancestors_.push_back({.path = path, .id = any_.FirstLeft(removed_), .addition = addition_});
}

void FolderSet::FindOwn(std::string_view path) {
  std::vector<long long> ids;
  Statement query(photos_, "select * FROM Folders where name = ? and volume = ?");
  query.BindTextView(1, path);
  query.BindTextView(2, volume_);
  while (query.Fetch()) {
    ids.push_back(query.GetInt64(0));
  }
  own_.Reset(ids);
}

void FolderSet::Add(const MergeItem& folder) {
  if (addition_ != NONE || any_.FirstLeft(removed_)) {
    return;
  }
  const Addition addition = MakeAddition(folder);
  if (addition.parent == NONE && addition.parentId == NO_FOLDER) {
    return;
  }
  if (!removals_.empty()) {
    Flush();
  }
  addition_ = additions_.size();
  additions_.push_back(addition);
}

FolderSet::Addition FolderSet::MakeAddition(const MergeItem& folder) {
  const std::string_view path = ParentPath(folder.Path());
  const auto parent = std::ranges::lower_bound(
      ancestors_, path.size(), {}, [](const Ancestor& ancestor) { return ancestor.path.size(); });
  if (parent == ancestors_.end() || parent->path.size() != path.size()) {
    return {.folder = &folder, .parentId = FirstAt(path).value_or(NO_FOLDER)};
  }
  if (parent->id == NO_FOLDER && isNoFolderRemoved_) {
    parent->id = FirstAt(path); // the next one at its path
  }
  return {
      .folder = &folder, .parentId = parent->id.value_or(NO_FOLDER), .parent = parent->addition};
}

std::optional<long long> FolderSet::FirstAt(std::string_view path) {
  if (!removals_.empty()) {
    Flush();
  }
  const std::span<const long long> ids = finder_.Find(path);
  return ids.empty() ? std::nullopt : std::optional(ids.front());
}

void FolderSet::Remove(const MergeItem& folder) {
  if (!additions_.empty()) {
    Flush();
  }
  output_.WriteLine({"Deleting ", folder.Path()});
  const std::optional<long long> id = own_.FirstLeft(removed_);
  if (id) {
    output_.WriteLine({"Found folder ", std::to_string(*id), " for ", folder.Path()});
  }
  // A folder that is not found is removed by the id NO_FOLDER, which a row may have.
  isNoFolderRemoved_ = isNoFolderRemoved_ || id.value_or(NO_FOLDER) == NO_FOLDER;
  removed_.insert(id.value_or(NO_FOLDER));
  removals_.push_back(id.value_or(NO_FOLDER));
}

void FolderSet::Flush() {
  finder_.Stop();
  output_.Flush();
  if (!additions_.empty()) {
    ExecuteAdditions();
  }
  if (!removals_.empty()) {
    for (
        const char* const sql :
        {"DELETE FROM Files INDEXED BY Files_folderId WHERE folder_id IN (SELECT id FROM temp.input)",
         "DELETE FROM Folders WHERE folder_id IN (SELECT id FROM temp.input)"}) {
      IdRows rows(removals_);
      Statement(photos_, sql, rows).Execute();
    }
    removals_.clear();
  }
}

void FolderSet::ExecuteAdditions() {
  AdditionRows rows(photos_, additions_);
  Statement insert(photos_,
                   "INSERT INTO Folders(parent_folder_id, name, modified_date, volume) SELECT id, "
                   "name, time, ? FROM temp.input",
                   rows);
  insert.BindTextView(1, volume_);
  insert.Execute();
  for (Ancestor& ancestor : ancestors_) {
    if (ancestor.addition != NONE) {
      ancestor.id = additions_[ancestor.addition].id;
      ancestor.addition = NONE;
    }
  }
  if (addition_ != NONE) {
    const std::array<long long, 1> added{additions_[addition_].id};
    removed_.erase(added.front()); // a database may lack its sequence, and use an id again
    any_.Reset(added);
    own_.Reset(added);
    addition_ = NONE;
  }
  additions_.clear();
}

} // namespace orva::dbmerger
