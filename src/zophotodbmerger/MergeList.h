#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <memory_resource>
#include <span>
#include <string_view>
#include <vector>

namespace orva::dbmerger {

/// What a merge needs of a catalog's row. The texts belong to the list. Times are in seconds since
/// the epoch.
struct MergeItem {
  std::string_view path{}; ///< full path
  std::string_view name{}; ///< of a file
  std::int32_t modified = 0;
  std::int32_t updated = 0; ///< last change of a file's transcoding
  std::int32_t status = 0;
  bool isDeleted = false;
  bool isSystem = false;
};

/// The rows of a catalog that a merge applies, in the order of their paths, byte by byte: a folder
/// comes before what it holds. The texts are in one pool. One thread at a time.
class MergeList {
public:
  MergeList() = default;
  MergeList(MergeList&&) = default;
  MergeList& operator=(MergeList&&) = delete;
  ~MergeList() = default;

  /// Adds a copy of `item`, whose path is `base` followed by `item.path`.
  void Add(std::string_view base, MergeItem item);

  /// Brings the items into their order. Equal paths have no particular order.
  void Sort();

  std::size_t Size() const noexcept { return items_.size(); }
  std::span<const MergeItem> Items() const noexcept { return items_; }

private:
  std::string_view Store(std::string_view first, std::string_view second);

  std::unique_ptr<std::pmr::monotonic_buffer_resource> pool_ =
      std::make_unique<std::pmr::monotonic_buffer_resource>();
  std::vector<MergeItem> items_;
  bool isSorted_ = true;
};

} // namespace orva::dbmerger
