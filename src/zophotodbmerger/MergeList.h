#pragma once

#include "LargeBlocks.h"

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
class MergeItem {
public:
  /// `text` has the path, and the name at its end, or else directly after it.
  MergeItem(const char* text, std::size_t pathSize, std::size_t nameSize, bool isNameInPath)
      : text_(text), pathSize_(static_cast<std::uint32_t>(pathSize)),
        nameSize_(static_cast<std::uint32_t>(nameSize)), isNameInPath_(isNameInPath) {}

  /// The full path.
  std::string_view Path() const noexcept { return {text_, pathSize_}; }
  /// The name of a file.
  std::string_view Name() const noexcept {
    return {text_ + pathSize_ - (isNameInPath_ ? nameSize_ : 0), nameSize_};
  }

private:
  const char* text_;
  std::uint32_t pathSize_; // SQLite's longest text is shorter
  std::uint32_t nameSize_;

public:
  std::int32_t modified = 0;
  std::int32_t updated = 0; ///< last change of a file's transcoding
  std::int32_t status = 0;
  bool isDeleted = false;
  bool isSystem = false;

private:
  bool isNameInPath_;
};

/// The rows of a catalog that a merge applies, in the order of their paths, byte by byte: a folder
/// comes before what it holds. The texts are in one pool. One thread at a time.
class MergeList {
public:
  /// Adds a row whose path is `base` followed by `path`. Returns it, for its other values; valid
  /// until the next call.
  MergeItem& Add(std::string_view base, std::string_view path, std::string_view name);

  /// Brings the items into their order, those with equal paths in the order in which they were
  /// added. Fast for rows that came folder by folder.
  void Sort();

  std::size_t Size() const noexcept { return items_.size(); }
  std::span<const MergeItem> Items() const noexcept { return items_; }

private:
  std::unique_ptr<std::pmr::monotonic_buffer_resource> pool_ =
      std::make_unique<std::pmr::monotonic_buffer_resource>(LargeBlocks());
  std::pmr::vector<MergeItem> items_{LargeBlocks()};
  std::vector<std::size_t> runs_; ///< where the second and each later run of items in order begins
};

} // namespace orva::dbmerger
