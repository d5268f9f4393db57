#include "stdafx.h"

#include "MergeList.h"

#include <algorithm>

namespace orva::dbmerger {

MergeItem& MergeList::Add(std::string_view base, std::string_view path, std::string_view name) {
  const bool isNameInPath = path.ends_with(name);
  const std::size_t pathSize = base.size() + path.size();
  char* const text =
      static_cast<char*>(pool_->allocate(pathSize + (isNameInPath ? 0 : name.size()), 1));
  char* end = std::ranges::copy(base, text).out;
  end = std::ranges::copy(path, end).out;
  if (!isNameInPath) {
    std::ranges::copy(name, end);
  }
  const MergeItem item(text, pathSize, name.size(), isNameInPath);
  isSorted_ = isSorted_ && (items_.empty() || items_.back().Path() <= item.Path());
  return items_.emplace_back(item);
}

void MergeList::Sort() {
  if (!isSorted_) {
    std::ranges::sort(items_, {}, &MergeItem::Path);
    isSorted_ = true;
  }
}

} // namespace orva::dbmerger
