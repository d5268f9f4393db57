#include "Table.h"

#include "Text.h"

#include <algorithm>
#include <numeric>
#include <ostream>
#include <utility>

namespace orva::zophotos {

namespace {

constexpr std::size_t GAP = 2;
/// The smallest width of a shortened elastic column.
constexpr std::size_t NARROWEST = 12;

std::size_t Total(const std::vector<std::size_t>& widths) {
  return std::accumulate(widths.begin(), widths.end(), GAP * (widths.size() - 1));
}

} // namespace

Table::Table(std::vector<Column> columns) : columns_(std::move(columns)) {
  std::vector<std::string> headings;
  for (const Column& column : columns_) {
    headings.push_back(column.heading);
  }
  AddRow(std::move(headings));
}

void Table::AddRow(std::vector<std::string> cells, bool colors) {
  rows_.push_back(std::move(cells));
  colors_.push_back(colors);
}

std::vector<std::size_t> Table::Widths(std::size_t limit) const {
  std::vector<std::size_t> widths(columns_.size());
  for (const auto& row : rows_) {
    for (std::size_t i = 0; i < widths.size(); ++i) {
      widths[i] = std::max(widths[i], Width(row[i]));
    }
  }
  const std::size_t total = Total(widths);
  std::size_t excess = total - std::min(total, limit);
  for (std::size_t i = 0; i < widths.size(); ++i) {
    if (columns_[i].elastic && widths[i] > NARROWEST) {
      const std::size_t given = std::min(excess, widths[i] - NARROWEST);
      widths[i] -= given;
      excess -= given;
    }
  }
  return widths;
}

std::size_t Table::NarrowestWidth() const {
  return Total(Widths(0));
}

void Table::Print(std::ostream& stream, std::optional<std::size_t> width) const {
  const std::size_t limit = width.value_or(std::string::npos);
  const std::vector<std::size_t> widths = Widths(limit);
  for (std::size_t number = 0; number < rows_.size(); ++number) {
    const auto& row = rows_[number];
    std::string line;
    std::size_t last = 0; // where the last cell begins
    for (std::size_t i = 0; i < widths.size(); ++i) {
      const std::string cell = Shorten(row[i], widths[i]);
      const std::string padding(widths[i] - Width(cell), ' ');
      last = line.size();
      line += columns_[i].right ? padding + cell : cell + padding;
      line.append(GAP, ' ');
    }
    line.erase(line.find_last_not_of(' ') + 1);
    if (Width(line) > limit) {
      // A number without its end would look like another number, so the cut is marked.
      line = std::string(Head(line, limit - 1)) + "…";
    } else if (last < line.size()) {
      line = line.substr(0, last) + FolderColor(line.substr(last), colors_[number]);
    }
    stream << line << '\n';
  }
}

} // namespace orva::zophotos
