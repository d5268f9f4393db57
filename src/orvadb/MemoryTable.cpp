#include "MemoryTable.h"

#include "WorkLimit.h"

#include "orvadb/ErrorMessage.h"
#include "orvadb/Rows.h"

#include <sqlite3.h>

#include <memory>
#include <new>
#include <string_view>

namespace orva::db {

/// The functions that SQLite calls.
struct MemoryTable::Module {
  struct Table : sqlite3_vtab {
    MemoryTable* owner = nullptr;
  };

  struct Cursor : sqlite3_vtab_cursor {
    Rows* rows = nullptr;
    WorkLimit* workLimit = nullptr;
    bool isAtEnd = false;
    sqlite3_int64 number = 0; ///< of the current row
  };

  static int Connect(sqlite3* handle, void* owner, int /*count*/, const char* const* arguments,
                     sqlite3_vtab** result, char** error) noexcept {
    // An untrusted database may have a virtual table of this module in its schema.
    if (std::string_view(arguments[1]) != "temp") {
      *error = sqlite3_mprintf("not a table of a database");
      return SQLITE_ERROR;
    }
    const int code =
        sqlite3_declare_vtab(handle, "CREATE TABLE input(id INTEGER, name TEXT, time INTEGER)");
    if (code != SQLITE_OK) {
      return code;
    }
    auto table = std::unique_ptr<Table>(new (std::nothrow) Table());
    if (!table) {
      return SQLITE_NOMEM;
    }
    table->owner = static_cast<MemoryTable*>(owner);
    *result = table.release();
    return SQLITE_OK;
  }

  static int Disconnect(sqlite3_vtab* table) noexcept {
    const std::unique_ptr<Table> owned(static_cast<Table*>(table));
    return SQLITE_OK;
  }

  static int FindBestIndex(sqlite3_vtab* /*table*/, sqlite3_index_info* /*info*/) noexcept {
    return SQLITE_OK;
  }

  static int Open(sqlite3_vtab* table, sqlite3_vtab_cursor** result) noexcept {
    auto cursor = std::unique_ptr<Cursor>(new (std::nothrow) Cursor());
    if (!cursor) {
      return SQLITE_NOMEM;
    }
    cursor->rows = static_cast<Table*>(table)->owner->rows_;
    cursor->workLimit = &static_cast<Table*>(table)->owner->workLimit_;
    *result = cursor.release();
    return SQLITE_OK;
  }

  static int Close(sqlite3_vtab_cursor* cursor) noexcept {
    const std::unique_ptr<Cursor> owned(static_cast<Cursor*>(cursor));
    return SQLITE_OK;
  }

  static int Next(sqlite3_vtab_cursor* base) noexcept {
    auto* const cursor = static_cast<Cursor*>(base);
    cursor->isAtEnd = !cursor->rows->Next();
    ++cursor->number;
    cursor->workLimit->AllowForRow();
    return SQLITE_OK;
  }

  static int Filter(sqlite3_vtab_cursor* cursor, int /*index*/, const char* /*name*/, int /*count*/,
                    sqlite3_value** /*arguments*/) noexcept {
    return Next(cursor);
  }

  static int IsAtEnd(sqlite3_vtab_cursor* cursor) noexcept {
    return static_cast<Cursor*>(cursor)->isAtEnd ? 1 : 0;
  }

  static int GetColumn(sqlite3_vtab_cursor* cursor, sqlite3_context* result, int column) noexcept {
    const Rows::Value value =
        static_cast<Cursor*>(cursor)->rows->Get(static_cast<Rows::Column>(column));
    if (const auto* const number = std::get_if<long long>(&value)) {
      sqlite3_result_int64(result, *number);
    } else if (const auto* const text = std::get_if<std::string_view>(&value)) {
      sqlite3_result_text64(result, text->data(), text->size(), SQLITE_STATIC, SQLITE_UTF8);
    }
    return SQLITE_OK;
  }

  static int GetRowId(sqlite3_vtab_cursor* cursor, sqlite3_int64* result) noexcept {
    *result = static_cast<Cursor*>(cursor)->number;
    return SQLITE_OK;
  }

  static constexpr sqlite3_module FUNCTIONS{.iVersion = 0,
                                            .xCreate = &Connect,
                                            .xConnect = &Connect,
                                            .xBestIndex = &FindBestIndex,
                                            .xDisconnect = &Disconnect,
                                            .xDestroy = &Disconnect,
                                            .xOpen = &Open,
                                            .xClose = &Close,
                                            .xFilter = &Filter,
                                            .xNext = &Next,
                                            .xEof = &IsAtEnd,
                                            .xColumn = &GetColumn,
                                            .xRowid = &GetRowId,
                                            .xUpdate = nullptr,
                                            .xBegin = nullptr,
                                            .xSync = nullptr,
                                            .xCommit = nullptr,
                                            .xRollback = nullptr,
                                            .xFindFunction = nullptr,
                                            .xRename = nullptr,
                                            .xSavepoint = nullptr,
                                            .xRelease = nullptr,
                                            .xRollbackTo = nullptr,
                                            .xShadowName = nullptr};
};

MemoryTable::MemoryTable(sqlite3* handle, WorkLimit& workLimit)
    : handle_(handle), workLimit_(workLimit) {
  if (sqlite3_create_module_v2(handle, "orva_input", &Module::FUNCTIONS, this, nullptr) !=
      SQLITE_OK) {
    throw ErrorMessage(handle, "create module orva_input");
  }
}

void MemoryTable::Provide(Rows& rows) {
  rows_ = &rows;
  const char* const sql = "CREATE VIRTUAL TABLE IF NOT EXISTS temp.input USING orva_input";
  if (sqlite3_exec(handle_, sql, nullptr, nullptr, nullptr) != SQLITE_OK) {
    throw ErrorMessage(handle_, sql);
  }
}

} // namespace orva::db
