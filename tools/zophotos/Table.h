#pragma once

#include <cstddef>
#include <iosfwd>
#include <optional>
#include <string>
#include <vector>

namespace orva::zophotos {

/// Prints rows of printable texts in columns that fit the terminal.
class Table {
public:
  struct Column {
    std::string heading;
    bool right = false;   ///< aligned to the right
    bool elastic = false; ///< may be shortened when the terminal is narrow
  };

  explicit Table(std::vector<Column> columns);

  /// Adds a row with one text per column. The last one is in the colour of folders if `colors` is
  /// set.
  void AddRow(std::vector<std::string> cells, bool colors = false);

  /// Writes the headings and all rows, in at most `width` terminal columns. Shortens elastic
  /// columns first, then cuts the ends of the lines.
  void Print(std::ostream& stream, std::optional<std::size_t> width) const;

  /// The smallest width at which Print cuts no line.
  std::size_t NarrowestWidth() const;

private:
  /// Widths of the columns. Elastic columns shrink until the total is `limit`, if possible.
  std::vector<std::size_t> Widths(std::size_t limit) const;

  std::vector<Column> columns_;
  std::vector<std::vector<std::string>> rows_; ///< the first row is the headings
  std::vector<bool> colors_;                   ///< of each row
};

} // namespace orva::zophotos
