#pragma once

struct sqlite3;

namespace orva::db {

class Rows;
class WorkLimit;

/// The virtual table temp.input of a connection, which gives statements the rows of a Rows object.
/// Lives as long as the connection. Not usable from a database's own schema.
class MemoryTable {
public:
  /// For `handle`. A statement may work in proportion to the rows that it has read: `workLimit`
  /// learns of them.
  MemoryTable(sqlite3* handle, WorkLimit& workLimit);
  MemoryTable(const MemoryTable&) = delete;
  MemoryTable& operator=(const MemoryTable&) = delete;
  ~MemoryTable() = default;

  /// Makes sure that the table exists, which a rollback removes. The next statement that reads it
  /// gets `rows`. Throws std::string.
  void Provide(Rows& rows);

private:
  struct Module;

  sqlite3* handle_;
  WorkLimit& workLimit_;
  Rows* rows_ = nullptr;
};

} // namespace orva::db
