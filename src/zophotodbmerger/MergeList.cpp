#include "stdafx.h"

#include "MergeList.h"

#include <algorithm>
#include <functional>
#include <tuple>

namespace orva::dbmerger {

namespace {

/// Items that are in order.
struct Run {
  const MergeItem* next;
  const MergeItem* end;

  /// For a heap, whose first run is the one with the first item.
  bool operator<(const Run& other) const {
    return std::tuple(other.next->Path(), other.next) < std::tuple(next->Path(), next);
  }
};

} // namespace

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
  if (!items_.empty() && item.Path() < items_.back().Path()) {
    runs_.push_back(items_.size());
  }
  return items_.emplace_back(item);
}

// Merges the runs. Those whose first item is not reached yet wait outside of the heap: mostly only
// the runs of a folder and of the folders above it are in it.
void MergeList::Sort() {
  if (runs_.empty()) {
    return;
  }
  std::vector<Run> waiting;
  waiting.reserve(runs_.size() + 1);
  const MergeItem* begin = items_.data();
  for (const std::size_t run : runs_) {
    waiting.push_back({.next = begin, .end = items_.data() + run});
    begin = waiting.back().end;
  }
  waiting.push_back({.next = begin, .end = items_.data() + items_.size()});
  std::ranges::sort(waiting, std::less<>()); // the first one last

  std::pmr::vector<MergeItem> sorted(LargeBlocks());
  sorted.reserve(items_.size());
  std::vector<Run> heap;
  while (!heap.empty() || !waiting.empty()) {
    if (heap.empty() || (!waiting.empty() && heap.front() < waiting.back())) {
      heap.push_back(waiting.back());
      waiting.pop_back();
      std::ranges::push_heap(heap, std::less<>());
    }
    std::ranges::pop_heap(heap, std::less<>());
    Run& first = heap.back();
    sorted.push_back(*first.next++);
    if (first.next == first.end) {
      heap.pop_back();
    } else {
      std::ranges::push_heap(heap, std::less<>());
    }
  }
  items_ = std::move(sorted);
  runs_.clear();
}

} // namespace orva::dbmerger
