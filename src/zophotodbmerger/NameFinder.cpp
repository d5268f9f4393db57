#include "stdafx.h"

#include "NameFinder.h"

#include "PhotoDB.h"

#include <algorithm>

namespace orva::dbmerger {

namespace {

using db::Statement;

bool IsText(const Statement& row, int column, std::string_view text) {
  return row.IsText(column) && row.GetTextView(column) == text;
}

} // namespace

/// Reads all files of the folders.
class NameFinder::FolderSearch {
public:
  FolderSearch(NameFinder& finder, std::span<const std::string_view> names,
               std::span<const long long> folderIds)
      : files_(finder.files_), volume_(finder.volume_), names_(names), folderIds_(folderIds) {}

  /// Reads one file. Returns whether there may be more.
  bool Step() {
    isInFolder_ = isInFolder_ ? files_.Next() : files_.First(folderIds_.front());
    if (!isInFolder_) {
      folderIds_ = folderIds_.subspan(1);
      return !folderIds_.empty();
    }
    const Statement& file = files_.Row();
    if (file.IsText(2) && FindName(file.GetTextView(2))) {
      found_.push_back({.name = static_cast<std::uint32_t>(position_),
                        .isOwn = IsText(file, 3, volume_),
                        .id = file.GetInt64(1),
                        .folderId = folderIds_.front()});
    }
    return true;
  }

  std::vector<FoundFile> TakeFound() { return std::move(found_); }

private:
  /// Whether `name` is one of the names; its position then. Files are mostly in the order of their
  /// names, so the next one is tried first.
  bool FindName(std::string_view name) {
    if (position_ + 1 < names_.size() && names_[position_ + 1] == name) {
      ++position_;
      return true;
    }
    const auto found = std::ranges::lower_bound(names_, name);
    if (found == names_.end() || *found != name) {
      return false;
    }
    position_ = static_cast<std::size_t>(found - names_.begin());
    return true;
  }

  FilesByFolder& files_;
  const std::string& volume_;
  std::span<const std::string_view> names_;
  std::span<const long long> folderIds_; ///< whose files were not all read
  bool isInFolder_ = false;              ///< the current file is in the first one
  std::size_t position_ = 0;             ///< of the last name found
  std::vector<FoundFile> found_;
};

/// Reads all files that have one of the names.
class NameFinder::NameSearch {
public:
  NameSearch(const NameFinder& finder, std::span<const std::string_view> names,
             std::span<const long long> folderIds)
      : photos_(finder.photos_), volume_(finder.volume_), names_(names),
        folderIds_(folderIds.begin(), folderIds.end()) {
    std::ranges::sort(folderIds_);
  }

  /// Reads one file. Returns whether there may be more.
  bool Step() {
    if (!query_) {
      query_.emplace(photos_, "SELECT file_id, folder_id, volume FROM Files INDEXED BY Files_name "
                              "WHERE name = ?");
      query_->BindTextView(1, names_[position_]);
    }
    if (!query_->Fetch()) {
      query_.reset();
      ++position_;
      return position_ < names_.size();
    }
    const bool isId = query_->IsInteger(1);
    const long long folderId = query_->GetInt64(1);
    if (isId && std::ranges::binary_search(folderIds_, folderId)) {
      found_.push_back({.name = static_cast<std::uint32_t>(position_),
                        .isOwn = IsText(*query_, 2, volume_),
                        .id = query_->GetInt64(0),
                        .folderId = folderId});
    }
    return true;
  }

  std::vector<FoundFile> TakeFound() { return std::move(found_); }

private:
  const PhotoDB& photos_;
  const std::string& volume_;
  std::span<const std::string_view> names_;
  std::vector<long long> folderIds_; ///< sorted
  std::optional<Statement> query_;
  std::size_t position_ = 0; ///< of the name that is searched for
  std::vector<FoundFile> found_;
};

bool NameFinder::FilesByFolder::First(long long folderId) {
  if (!query_ || folderId <= folderId_) {
    Search(folderId);
  } else if (IsBefore(folderId)) {
    Advance();
    if (IsBefore(folderId)) {
      Search(folderId);
    }
  }
  folderId_ = folderId;
  return IsInFolder();
}

bool NameFinder::FilesByFolder::Next() {
  Advance();
  return IsInFolder();
}

// A value that is no integer may be anywhere.
bool NameFinder::FilesByFolder::IsBefore(long long folderId) const {
  return !isAtEnd_ && (!isId_ || position_ < folderId);
}

bool NameFinder::FilesByFolder::IsInFolder() const {
  return !isAtEnd_ && isId_ && position_ == folderId_;
}

void NameFinder::FilesByFolder::Search(long long folderId) {
  query_.reset();
  query_.emplace(photos_, "SELECT folder_id, file_id, name, volume FROM Files INDEXED BY "
                          "Files_folderId WHERE folder_id >= ? ORDER BY folder_id");
  query_->BindInt64(1, folderId);
  Advance();
}

void NameFinder::FilesByFolder::Advance() {
  isAtEnd_ = !query_->Fetch();
  if (!isAtEnd_) {
    isId_ = query_->IsInteger(0);
    position_ = query_->GetInt64(0);
  }
}

std::vector<FoundFile> NameFinder::Find(std::span<const std::string_view> names,
                                        std::span<const long long> folderIds) {
  if (names.empty() || folderIds.empty()) {
    return {};
  }
  FolderSearch throughFolders(*this, names, folderIds);
  NameSearch throughNames(*this, names, folderIds);
  // The search by names needs a step for each of them, so the other one may take as many first.
  for (std::size_t step = 0; true; ++step) {
    if (!throughFolders.Step()) {
      return throughFolders.TakeFound();
    }
    if (step >= names.size() && !throughNames.Step()) {
      return throughNames.TakeFound();
    }
  }
}

} // namespace orva::dbmerger
