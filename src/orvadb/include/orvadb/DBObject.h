#pragma once

#include <string>

namespace orva::db {

/// A row as an object.
class DBObject {
public:
  virtual ~DBObject() = default;

  virtual bool IsBackup() const = 0;
  virtual bool IsHidden() const = 0;
  virtual bool IsSystem() const = 0;
  virtual bool IsDeleted() const = 0;

  /// Name of the table that holds rows of this kind.
  virtual std::string GetTableName() const = 0;

  /// The row's identifier; -1 for an object that is not yet a row.
  virtual long long GetId() const = 0;

  /// The kind of row, an ItemType.
  virtual int GetItemType() const = 0;

  virtual int GetStatus() const = 0;

protected:
  DBObject() = default;
  DBObject(const DBObject&) = default;
  DBObject& operator=(const DBObject&) = default;
};

} // namespace orva::db
