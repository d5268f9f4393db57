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

  /// Writes all rows below their headings, in no more than `width` columns: elastic columns give
  /// way first, then the ends of the lines are left out.
  void Print(std::ostream& stream, std::optional<std::size_t> width) const;

  /// Columns that Print needs at least to leave nothing else out.
  std::size_t NarrowestWidth() const;

private:
  /// Widths of the columns, of which elastic ones give way to come to `limit` in all.
  std::vector<std::size_t> Widths(std::size_t limit) const;

  std::vector<Column> columns_;
  std::vector<std::vector<std::string>> rows_; ///< the first one is the headings
};

} // namespace orva::zophotos
