#include "stdafx.h"

#include "MergeList.h"

#include <algorithm>

namespace orva::dbmerger {

void MergeList::Add(std::string_view base, MergeItem item) {
  item.path = Store(base, item.path);
  item.name = item.path.ends_with(item.name) ? item.path.substr(item.path.size() - item.name.size())
                                             : Store(item.name, {});
  isSorted_ = isSorted_ && (items_.empty() || items_.back().path <= item.path);
  items_.push_back(item);
}

void MergeList::Sort() {
  if (!isSorted_) {
    std::ranges::sort(items_, {}, &MergeItem::path);
    isSorted_ = true;
  }
}

std::string_view MergeList::Store(std::string_view first, std::string_view second) {
  const std::size_t size = first.size() + second.size();
  char* const text = static_cast<char*>(pool_->allocate(size, 1));
  std::ranges::copy(first, text);
  std::ranges::copy(second, text + first.size());
  return {text, size};
}

} // namespace orva::dbmerger
