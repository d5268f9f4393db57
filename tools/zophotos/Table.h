#pragma once

#include <cstddef>
#include <iosfwd>
#include <optional>
#include <string>
#include <vector>

namespace orva::zophotos {

/// Rows of printable texts in columns, which fit the terminal.
class Table {
public:
  struct Column {
    std::string heading;
    bool right = false;   ///< aligned to the right
    bool elastic = false; ///< may be shortened when the terminal is narrow
  };

  explicit Table(std::vector<Column> columns);

  /// Adds a row with a text for each column.
  void AddRow(std::vector<std::string> cells);

  /// Writes all rows below their headings, in no more than `width` columns where elastic columns
  /// can give way for it.
  void Print(std::ostream& stream, std::optional<std::size_t> width) const;

private:
  std::vector<std::size_t> Widths(std::optional<std::size_t> limit) const;

  std::vector<Column> columns_;
  std::vector<std::vector<std::string>> rows_; ///< the first one is the headings
};

} // namespace orva::zophotos
