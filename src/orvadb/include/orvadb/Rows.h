#pragma once

#include <string_view>
#include <variant>

namespace orva::db {

/// Rows in memory that a statement reads as the table temp.input(id, name, time), once and
/// in their order. On the connection's thread.
class Rows {
public:
  enum Column : int { ID, NAME, TIME };
  using Value = std::variant<long long, std::string_view>;

  Rows() = default;
  Rows(const Rows&) = delete;
  Rows& operator=(const Rows&) = delete;
  virtual ~Rows() = default;

  /// Moves to the next row, at first to the first one. Returns whether there is one. A statement
  /// that inserts the rows has inserted the one before.
  virtual bool Next() noexcept = 0;

  /// A value of the current row. Its text stays valid until the statement has finished.
  virtual Value Get(Column column) const noexcept = 0;
};

} // namespace orva::db
