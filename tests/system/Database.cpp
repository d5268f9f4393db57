#include "Database.h"

namespace orva::test {

Database::Database(const std::string& path, bool create)
    : SQLite::Database(path, SQLite::OPEN_READWRITE | (create ? SQLite::OPEN_CREATE : 0), 60'000) {}

std::vector<std::string> Database::Run(const std::string& sql, const Values& values) const {
  SQLite::Statement statement(*this, sql);
  for (int i = 0; i < std::ssize(values); ++i) {
    statement.bindNoCopy(i + 1, values[static_cast<std::size_t>(i)]);
  }
  std::vector<std::string> rows;
  while (statement.executeStep()) {
    std::string& row = rows.emplace_back();
    for (int column = 0; column < statement.getColumnCount(); ++column) {
      row += column == 0 ? "" : "|";
      row += statement.getColumn(column).getText("NULL");
    }
  }
  return rows;
}

} // namespace orva::test
