#pragma once

#include "orvadb/Connection.h"

#include <ctime>
#include <string>
#include <string_view>

namespace orva::db {

class DB;

/// One use of a prepared statement: construct, bind, then Execute or a loop of Step with the
/// getters after each row, then destroy. Parameters count from 1, columns from 0. On the
/// connection's thread. `file` and `line` are the caller's and only serve error messages;
/// failures are thrown as std::string.
///
/// The compiled form is kept by the connection under the text: using the same text again does
/// not compile again.
class Statement {
public:
  static constexpr int ROW = 100;  ///< a row is ready
  static constexpr int DONE = 101; ///< the statement has finished

  /// Prepares `sql` on `db`, which outlives the statement. The text must stay valid as long
  /// as the statement.
  Statement(const DB& db, const char* sql, const char* file, unsigned int line);
  Statement(const Statement&) = delete;
  Statement& operator=(const Statement&) = delete;
  ~Statement() = default;

  /// Runs to the next row or the end and returns SQLite's result code, throwing nothing: ROW,
  /// DONE, or another, after which the running transaction cannot be committed.
  int Step(const char* file, unsigned int line);

  /// Step for callers to whom any other code than ROW or DONE is a failure, which is thrown.
  /// Returns whether a row is ready.
  bool Fetch(const char* file, unsigned int line);

  /// Runs to completion.
  void Execute(const char* file, unsigned int line);

  void BindInt(int index, int value, const char* file, unsigned int line);
  void BindInt64(int index, long long value, const char* file, unsigned int line);
  /// Copies the text, NUL bytes included.
  void BindText(int index, const std::string& value, const char* file, unsigned int line);
  /// Seconds since the epoch, stored as an integer.
  void BindTime(int index, long value, const char* file, unsigned int line);

  /// BindText without the copy: the text must stay as it is for as long as the statement.
  void BindTextView(int index, std::string_view value, const char* file, unsigned int line);

  /// What the statement has cost since this was last asked, in steps of SQLite's machine.
  int TakeCost() const;

  /// The low 32 bits of an integer column, with their sign.
  int GetInt(int column) const;
  long long GetInt64(int column) const;
  bool IsNull(int column) const;
  /// The text with its NUL bytes; NULL gives the empty string.
  std::string GetText(int column) const;
  /// The same where it lies: valid until the next step or getter of the column.
  std::string_view GetTextView(int column) const;
  std::time_t GetTime(int column) const;
  /// True for a non-zero integer.
  bool GetBool(int column) const;

private:
  void CheckBind(int code, const char* file, unsigned int line) const;

  const DB& db_;
  Connection::CheckedOut statement_;
};

} // namespace orva::db
