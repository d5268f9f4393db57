#pragma once

namespace orva::dbmerger {

/// The order of a merge: by full path, byte by byte, so that a folder comes before what it holds.
template <typename Item>
struct FolderItemCmp {
  bool operator()(const Item* a, const Item* b) const { return a->path.compare(b->path) < 0; }
};

} // namespace orva::dbmerger
