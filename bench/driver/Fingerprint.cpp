#include "Fingerprint.h"

#include "Sql.h"

namespace orva::bench {

namespace {

/// FNV-1a.
class Hash {
public:
  void Add(const std::string& text) {
    for (const char byte : text) {
      Add(static_cast<unsigned char>(byte));
    }
    Add(0); // the end of a column
  }
  std::uint64_t Value() const { return value_; }

private:
  void Add(unsigned char byte) { value_ = (value_ ^ byte) * 1099511628211U; }

  std::uint64_t value_ = 14695981039346656037U;
};

Fingerprint::Rows Sum(const db::DB& database, int columns, const catalog::Sql& sql) {
  Fingerprint::Rows rows;
  catalog::ForEachRow(database, sql, [&](const db::Statement& row) {
    Hash hash;
    for (int column = 0; column < columns; ++column) {
      hash.Add(row.GetText(column));
    }
    ++rows.count;
    rows.sum += hash.Value();
  });
  return rows;
}

} // namespace

Fingerprint TakeFingerprint(const std::string& path) {
  db::DB database;
  database.Open(path);
  return {.folders = Sum(database, 4,
                         "SELECT f.name, coalesce(p.name, f.parent_folder_id), f.modified_date, "
                         "f.volume FROM Folders f LEFT JOIN Folders p "
                         "ON p.folder_id = f.parent_folder_id"),
          .files = Sum(database, 5,
                       "SELECT o.name, f.name, f.modified_date, f.created_date, f.volume "
                       "FROM Files f LEFT JOIN Folders o ON o.folder_id = f.folder_id"),
          .statistics = Sum(database, 4,
                            "SELECT volume, photos_xcoded, photos_total, last_updated_time "
                            "FROM Statistics"),
          .schema = Sum(database, 3, "SELECT type, name, coalesce(sql, '') FROM sqlite_master")};
}

} // namespace orva::bench
