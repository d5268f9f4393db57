#pragma once

#include "orvadb/Rows.h"

#include <cstddef>
#include <span>

namespace orva::dbmerger {

/// Ids as rows.
class IdRows final : public db::Rows {
public:
  /// `ids` stay as they are for as long as the rows are used.
  explicit IdRows(std::span<const long long> ids) : ids_(ids) {}

  bool Next() noexcept override { return next_++ != ids_.size(); }
  Value Get(Column /*column*/) const noexcept override { return ids_[next_ - 1]; }

private:
  std::span<const long long> ids_;
  std::size_t next_ = 0;
};

} // namespace orva::dbmerger
