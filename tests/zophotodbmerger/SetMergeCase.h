#pragma once

#include "MergeList.h"

#include <cstddef>
#include <cstdint>
#include <ctime>
#include <string>
#include <vector>

namespace orva::test {

/// A row of a catalog, with its full path.
struct CatalogRow {
  std::string path;
  std::string name{}; ///< of a file
  bool isDeleted = false;
  bool isSystem = false;
  std::int32_t modified = 0;
  std::int32_t updated = 0;
  std::int32_t status = 0;
};

/// The merge of one catalog.
struct CatalogMerge {
  std::string volume;
  std::vector<CatalogRow> folders{};
  std::vector<CatalogRow> files{};
  std::time_t since = 0;
};

/// The rows as the merger sorts them.
dbmerger::MergeList MakeMergeList(const std::vector<CatalogRow>& rows);

/// Some merges in one transaction.
struct MergeTransaction {
  std::vector<CatalogMerge> merges{};
  bool isCommitted = true;
};

/// A merged database and what is applied to it, in transactions of one PhotoDB.
struct MergeCase {
  std::vector<std::string> database; ///< SQL that makes the database, row by row
  std::size_t schemaSize = 0;        ///< how many of the statements make the schema
  std::vector<MergeTransaction> transactions{};
};

/// SQL that makes the tables and indexes of PhotoDB, without rows.
std::vector<std::string> OwnSchema();

/// `bytes` as an SQL expression for a text.
std::string SqlText(const std::string& bytes);

/// A random case, the same for the same seed, of some ten rows times `scale`.
MergeCase MakeMergeCase(unsigned seed, std::size_t scale = 1);

/// How the operations on single rows and SetMerge differ in the case; empty if they do not.
std::string CompareMerges(const MergeCase& merge);

/// Stops during the statement of a set, after some of the folders and after some of the files.
struct MiddleStops {
  int folders = 0;
  int files = 0;
};

/// CompareMerges for the first merge of the case, with a stop request at each of its statements:
/// its effects are those of some of the first rows. Adds to `stops`. Throws std::string if the
/// database refuses a row.
std::string CompareStoppedMerges(const MergeCase& merge, MiddleStops& stops);

/// The case without the parts that do not matter for its difference.
MergeCase Reduce(MergeCase merge);

/// The case for a message.
std::string Describe(const MergeCase& merge);

} // namespace orva::test
