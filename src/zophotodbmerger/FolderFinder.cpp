#include "stdafx.h"

#include "FolderFinder.h"

#include "PhotoDB.h"

namespace orva::dbmerger {

std::span<const long long> FolderFinder::Find(std::string_view path) {
  if (!query_ || path < lastPath_) {
    Search(path);
  } else if (IsBefore(path)) {
    Advance();
    if (IsBefore(path)) {
      Search(path);
    }
  }
  lastPath_ = path;
  ids_.clear();
  volume_.reset();
  while (!isAtEnd_ && query_->GetTextView(0) == path) {
    if (ids_.empty() && query_->IsText(2)) {
      volume_ = query_->GetTextView(2);
    }
    ids_.push_back(query_->GetInt64(1));
    Advance();
  }
  if (ids_.size() > 1) {
    // SQLite may find them in another order where the database has more indexes.
    ids_.clear();
    db::Statement inOrder(photos_, "select * FROM Folders where name = ?");
    inOrder.BindTextView(1, path);
    while (inOrder.Fetch()) {
      ids_.push_back(inOrder.GetInt64(0));
    }
  }
  return ids_;
}

bool FolderFinder::IsBefore(std::string_view path) const {
  return !isAtEnd_ && query_->GetTextView(0) < path;
}

void FolderFinder::Search(std::string_view path) {
  query_.reset();
  query_.emplace(photos_,
                 "SELECT name, folder_id, volume FROM Folders INDEXED BY Folders_path WHERE "
                 "name >= ? ORDER BY name");
  query_->BindText(1, std::string(path));
  Advance();
}

void FolderFinder::Advance() {
  // BLOBs come after all texts.
  isAtEnd_ = !query_->Fetch() || !query_->IsText(0);
}

} // namespace orva::dbmerger
