#pragma once

#include "orvadb/Connection.h"

#include <ctime>
#include <string>
#include <string_view>

namespace orva::db {

class DB;
class Rows;

/// One use of a prepared statement: construct, bind, then Execute or a loop of Step with the
/// getters after each row, then destroy. Parameters count from 1, columns from 0. On the
/// connection's thread. `file` and `line` are the caller's and only appear in error messages;
/// failures are thrown as std::string.
///
/// The connection keeps the compiled form: using the same text again does not compile again, unless
/// the schema may have changed. No other difference can be observed.
class Statement {
public:
  static constexpr int ROW = 100;  ///< a row is ready
  static constexpr int DONE = 101; ///< the statement has finished

  /// Prepares `sql` on `db`, which stays open, and is not opened again, until the statement is
  /// destroyed. The text must stay valid as long as the statement.
  Statement(const DB& db, const char* sql, const char* file = __builtin_FILE(),
            unsigned int line = __builtin_LINE());
  /// The same for a statement that reads `rows` as the table temp.input. The caller
  /// makes sure that it changes ordinary tables only. Until it is destroyed, there is no other such
  /// statement on `db`.
  Statement(const DB& db, const char* sql, Rows& rows, const char* file = __builtin_FILE(),
            unsigned int line = __builtin_LINE());
  Statement(const Statement&) = delete;
  Statement& operator=(const Statement&) = delete;
  ~Statement() = default;

  /// Runs to the next row or the end and returns SQLite's result code, throwing nothing: ROW,
  /// DONE, or another, after which the running transaction cannot be committed.
  int Step(const char* file = __builtin_FILE(), unsigned int line = __builtin_LINE());

  /// Step that throws on any other code than ROW or DONE. Returns whether a row is ready.
  bool Fetch(const char* file = __builtin_FILE(), unsigned int line = __builtin_LINE());

  /// Runs to completion.
  void Execute(const char* file = __builtin_FILE(), unsigned int line = __builtin_LINE());

  void BindInt(int index, int value, const char* file = __builtin_FILE(),
               unsigned int line = __builtin_LINE());
  void BindInt64(int index, long long value, const char* file = __builtin_FILE(),
                 unsigned int line = __builtin_LINE());
  /// Copies the text, NUL bytes included.
  void BindText(int index, const std::string& value, const char* file = __builtin_FILE(),
                unsigned int line = __builtin_LINE());
  /// Seconds since the epoch, stored as an integer.
  void BindTime(int index, long value, const char* file = __builtin_FILE(),
                unsigned int line = __builtin_LINE());

  /// BindText without the copy: the text must stay as it is until the statement is destroyed.
  void BindTextView(int index, std::string_view value, const char* file = __builtin_FILE(),
                    unsigned int line = __builtin_LINE());

  /// The low 32 bits of an integer column, with their sign.
  int GetInt(int column) const;
  long long GetInt64(int column) const;
  /// Whether the value is a text, and not a BLOB or a number that a getter converts.
  bool IsText(int column) const;
  bool IsInteger(int column) const;
  /// The text with its NUL bytes; NULL gives the empty string.
  std::string GetText(int column) const;
  /// The same without a copy: valid until the next step or getter of the column.
  std::string_view GetTextView(int column) const;
  std::time_t GetTime(int column) const;
  /// True for a non-zero integer.
  bool GetBool(int column) const;

private:
  void CheckBind(int code, const char* file, unsigned int line) const;

  Connection& connection_;
  Connection::CheckedOut statement_;
};

} // namespace orva::db
