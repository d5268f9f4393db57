#include "SetMergeCase.h"

#include "CapturedOutput.h"

#include "MergeList.h"
#include "PhotoDB.h"
#include "SetMerge.h"
#include "StandardOutput.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"
#include "orvadb/Statement.h"
#include "orvadb/Transaction.h"

#include <sqlite3.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <filesystem>
#include <fstream>
#include <functional>
#include <limits>
#include <memory>
#include <optional>
#include <random>
#include <span>
#include <stdexcept>

namespace orva::test {

namespace {

using dbmerger::MergeItem;
using dbmerger::MergeList;
using dbmerger::PhotoDB;
using dbmerger::SetMerge;
using dbmerger::StandardOutput;

// The schemas.

const std::string FOLDERS =
    "CREATE TABLE Folders(folder_id INTEGER PRIMARY KEY AUTOINCREMENT, parent_folder_id INTEGER "
    "NOT NULL, name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume TEXT NOT NULL)";
const std::string FILES =
    "CREATE TABLE Files(file_id INTEGER PRIMARY KEY AUTOINCREMENT, folder_id INTEGER NOT NULL, "
    "name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume TEXT NOT NULL, created_date "
    "INTEGER NOT NULL, FOREIGN KEY(folder_id) REFERENCES Folders(folder_id) ON DELETE CASCADE)";
const std::string UNTYPED_FOLDERS =
    "CREATE TABLE Folders(folder_id INTEGER PRIMARY KEY AUTOINCREMENT, parent_folder_id, name, "
    "modified_date, volume)";
const std::string UNTYPED_FILES =
    "CREATE TABLE Files(file_id INTEGER PRIMARY KEY AUTOINCREMENT, folder_id, name, modified_date, "
    "volume, created_date)";
const std::vector<std::string> INDEXES = {
    "CREATE INDEX Folders_folderId ON Folders(parent_folder_id)",
    "CREATE INDEX Folders_path ON Folders(name)", "CREATE INDEX Files_folderId ON Files(folder_id)",
    "CREATE INDEX Files_name ON Files(name)"};
const std::vector<std::string> OTHERS = {
    "CREATE TABLE Status(id INTEGER PRIMARY KEY AUTOINCREMENT, mc_version CHAR(16) NOT NULL, mdate "
    "INTEGER NOT NULL, desc CHAR(80), etype INTEGER)",
    "CREATE TABLE Statistics(id INTEGER PRIMARY KEY AUTOINCREMENT, volume TEXT NOT NULL, "
    "photos_xcoded INTEGER NOT NULL, photos_total INTEGER NOT NULL, last_updated_time INTEGER NOT "
    "NULL)"};

/// More indexes. Some of them change the order in which rows are found, or let an insertion fail.
const std::vector<std::string> MORE_INDEXES = {
    "CREATE INDEX more ON Folders(name, volume DESC)",
    "CREATE INDEX more ON Folders(name, volume DESC, parent_folder_id, modified_date)",
    "CREATE INDEX more ON Folders(name, parent_folder_id DESC, volume, modified_date)",
    "CREATE INDEX more ON Folders(volume, name, parent_folder_id DESC)",
    "CREATE INDEX more ON Folders(name, parent_folder_id DESC, volume)",
    "CREATE INDEX more ON Files(name, folder_id)",
    "CREATE INDEX more ON Files(folder_id, name DESC, volume)",
    "CREATE INDEX more ON Files(volume, name)",
    "CREATE INDEX more ON Files(name COLLATE NOCASE)",
    "CREATE INDEX more ON Folders(name COLLATE NOCASE)",
    "CREATE UNIQUE INDEX more ON Folders(name)",
    "CREATE UNIQUE INDEX more ON Folders(parent_folder_id)",
    "CREATE UNIQUE INDEX more ON Files(name)",
    "CREATE UNIQUE INDEX more ON Files(folder_id, name)",
    "CREATE UNIQUE INDEX more ON Files(folder_id, volume, name)",
    "CREATE UNIQUE INDEX more ON Files(modified_date)"};

std::string Replaced(std::string text, const std::string& from, const std::string& to) {
  const std::size_t place = text.find(from);
  if (place == std::string::npos) {
    throw std::logic_error("no '" + from + "' in " + text);
  }
  return text.replace(place, from.size(), to);
}

std::vector<std::string> Joined(std::vector<std::string> first,
                                const std::vector<std::string>& second) {
  first.insert(first.end(), second.begin(), second.end());
  return first;
}

/// Tables and indexes that are not those of PhotoDB.
std::vector<std::string> MakeForeignSchema(std::size_t number) {
  std::string folders = FOLDERS;
  std::string files = FILES;
  std::vector<std::string> indexes = INDEXES;
  std::vector<std::string> before;
  switch (number % 12) {
  case 0:
    folders = Replaced(folders, " AUTOINCREMENT", "");
    break;
  case 1:
    files = Replaced(files, " AUTOINCREMENT", "");
    break;
  case 2: // the id is not the rowid
    folders = Replaced(folders, "INTEGER PRIMARY KEY AUTOINCREMENT", "INTEGER DEFAULT 7");
    break;
  case 3:
    files = Replaced(files, "INTEGER PRIMARY KEY AUTOINCREMENT", "INTEGER DEFAULT -1");
    break;
  case 4:
    folders = Replaced(folders, "name TEXT NOT NULL", "name TEXT NOT NULL COLLATE NOCASE");
    break;
  case 5:
    files = Replaced(files, "name TEXT NOT NULL", "name TEXT NOT NULL COLLATE NOCASE");
    break;
  case 6:
    files = Replaced(files, "INTEGER PRIMARY KEY AUTOINCREMENT", "INTEGER DEFAULT 5");
    files = Replaced(files, ", FOREIGN", ", PRIMARY KEY(name, folder_id), FOREIGN");
    files += " WITHOUT ROWID";
    break;
  case 7:
    folders = Replaced(folders, "name TEXT NOT NULL", "name TEXT NOT NULL UNIQUE ON CONFLICT FAIL");
    files = Replaced(files, "name TEXT NOT NULL", "name TEXT NOT NULL UNIQUE ON CONFLICT IGNORE");
    break;
  case 8:
    folders = Replaced(folders, "volume TEXT NOT NULL",
                       "volume TEXT NOT NULL UNIQUE ON CONFLICT "
                       "REPLACE");
    files = Replaced(files, "modified_date INTEGER NOT NULL",
                     "modified_date INTEGER NOT NULL UNIQUE ON CONFLICT REPLACE");
    break;
  case 9:
    before = {"PRAGMA encoding = 'UTF-16le'"};
    break;
  case 10:
    indexes.erase(indexes.begin() + static_cast<std::ptrdiff_t>(number / 12 % 4));
    break;
  default:
    indexes.clear();
    break;
  }
  return Joined(Joined(before, Joined({folders, files}, indexes)), OTHERS);
}

/// Schemas of the merged database.
enum class Schema {
  Own,      ///< that of PhotoDB
  Untyped,  ///< the same, whose rows were stored before the columns had types
  Extended, ///< the own one with more indexes
  Foreign,  ///< another one with the same tables
};

/// SQL that makes a database with the tables of PhotoDB, without rows. A schema is selected from
/// its kind by `number`.
std::vector<std::string> MakeSchema(Schema schema, std::size_t number) {
  switch (schema) {
  case Schema::Own:
    break;
  case Schema::Untyped:
    return Joined(Joined({UNTYPED_FOLDERS, UNTYPED_FILES}, INDEXES), OTHERS);
  case Schema::Extended: {
    std::vector<std::string> sql = MakeSchema(Schema::Own, 0);
    sql.push_back(MORE_INDEXES[number % MORE_INDEXES.size()]);
    return sql;
  }
  case Schema::Foreign:
    return MakeForeignSchema(number);
  }
  return Joined(Joined({FOLDERS, FILES}, INDEXES), OTHERS);
}

/// The statement that gives tables that were made without types their types.
std::string SetTypes() {
  return "PRAGMA writable_schema = ON; UPDATE sqlite_schema SET sql = CASE name WHEN 'Folders' "
         "THEN '" +
         FOLDERS + "' ELSE '" + FILES + "' END WHERE name IN ('Folders', 'Files')";
}

} // namespace

std::vector<std::string> OwnSchema() {
  return MakeSchema(Schema::Own, 0);
}

std::string SqlText(const std::string& bytes) {
  constexpr std::string_view digits = "0123456789abcdef";
  if (std::ranges::all_of(bytes, [](char byte) { return byte >= ' ' && byte != '\''; })) {
    return "'" + bytes + "'";
  }
  std::string sql = "CAST(x'";
  for (const char byte : bytes) {
    const auto value = static_cast<unsigned char>(byte);
    sql += digits[value >> 4U];
    sql += digits[value & 15U];
  }
  return sql + "' AS TEXT)";
}

// Random cases.

namespace {

class Generator {
public:
  Generator(unsigned seed, std::size_t scale) : random_(seed), scale_(scale) {
    const auto sometimes = [this] { return OneIn(4); };
    oddPaths_ = sometimes();
    oddTexts_ = sometimes();
    oddIds_ = sometimes();
    oddValues_ = sometimes();
    oddSequences_ = sometimes();
    strays_ = sometimes();
  }

  MergeCase Make() {
    volumes_ = {"/shares/A/", "/shares/B/", "/shares/A/a/"};
    MakePaths();
    MergeCase result;
    AddSchema(result.database);
    result.schemaSize = result.database.size();
    AddRows(result.database);
    const std::size_t count = 1 + Below(3);
    while (result.transactions.size() < count) {
      result.transactions.push_back(MakeTransaction());
    }
    return result;
  }

private:
  std::size_t Below(std::size_t bound) {
    return std::uniform_int_distribution<std::size_t>(0, bound - 1)(random_);
  }

  bool OneIn(std::size_t count) { return Below(count) == 0; }

  template <typename Items>
  auto Any(const Items& items) {
    return items[Below(std::size(items))];
  }

  std::string Component() {
    using namespace std::string_literals;
    static const std::vector<std::string> plain{"a", "b", "ab", "a b", "A"};
    static const std::vector<std::string> odd{"a\0"s, "\0"s,   "\xff"s, "\xc3\x28"s, "a\xc3\xa4"s,
                                              "5"s,   "-1.5"s, ""s,     " a"s,       "a."s};
    std::string text = oddTexts_ && OneIn(2) ? Any(odd) : Any(plain);
    return scale_ == 1 ? text : text + std::to_string(Below(scale_));
  }

  void MakePaths() {
    paths_ = {Any(volumes_)};
    if (OneIn(3)) {
      paths_.push_back(Any(volumes_));
    }
    for (std::size_t count = 2 + Below(5 * scale_); count > 0; --count) {
      std::string path = Any(paths_) + Component();
      if (!(oddPaths_ && OneIn(4))) {
        path += '/';
      }
      if (oddPaths_ && OneIn(6)) {
        path += '/';
      }
      paths_.push_back(path);
    }
    if (oddPaths_) {
      for (const char* const path : {"", "/", "//", "a", "5", "/shares/", "/shares", "a/"}) {
        if (OneIn(5)) {
          paths_.emplace_back(path);
        }
      }
    }
    for (std::size_t count = 1 + Below(4 * scale_); count > 0; --count) {
      names_.push_back(Component());
    }
  }

  long long Id() {
    constexpr long long least = std::numeric_limits<long long>::min();
    constexpr long long most = std::numeric_limits<long long>::max();
    static constexpr std::array odd{-1LL, 0LL,      -2LL,     -1LL,  0LL, most,
                                    most, most - 1, most - 2, least, 7LL};
    if (strays_ && OneIn(4)) {
      return -1;
    }
    const long long id = Any(odd);
    // After the largest one a table without AUTOINCREMENT uses random ids.
    return oddIds_ && OneIn(4) && !(isForeign_ && id > 7)
               ? id
               : static_cast<long long>(1 + Below(8 * scale_));
  }

  std::string Text(const std::string& text) {
    if (oddValues_ && OneIn(5)) {
      switch (Below(isUntyped_ ? 4 : 1)) {
      case 0:
        return "CAST(" + SqlText(text) + " AS BLOB)";
      case 1:
        return "17"; // equals no name: statements find those by number or by text
      case 2:
        return "-2.25";
      default:
        return "NULL";
      }
    }
    return SqlText(text);
  }

  std::string Number(long long number) {
    // The least integer is no literal.
    std::string text = number == std::numeric_limits<long long>::min()
                           ? "(-9223372036854775807 - 1)"
                           : std::to_string(number);
    if (oddValues_ && OneIn(4)) {
      switch (Below(3)) {
      case 0:
        return text + ".5";
      case 1:
        return "'" + text + " or so'";
      default:
        return std::string("x'") + (number % 2 == 0 ? "32" : "2d31") + "'";
      }
    }
    return text;
  }

  void AddSchema(std::vector<std::string>& sql) {
    Schema schema = Schema::Own;
    switch (Below(10)) {
    case 0:
    case 1:
      schema = Schema::Extended;
      break;
    case 2:
      schema = Schema::Foreign;
      break;
    case 3:
    case 4:
      schema = oddValues_ ? Schema::Untyped : Schema::Own;
      break;
    default:
      break;
    }
    isUntyped_ = schema == Schema::Untyped;
    isForeign_ = schema == Schema::Foreign;
    sql = MakeSchema(schema, Below(1'000));
  }

  /// Rows that a constraint of the schema refuses are left out.
  void AddRows(std::vector<std::string>& sql) {
    sql.emplace_back("INSERT INTO Status VALUES(1, '2.0', 1000, '', 0)");
    if (!oddIds_ || !OneIn(4)) {
      sql.emplace_back("INSERT INTO Folders VALUES(1, -1, '/shares/', 0, '<DUMMY>')");
    }
    for (std::size_t count = Below(8 * scale_); count > 0; --count) {
      std::string id = oddIds_ || OneIn(3) ? Number(Id()) : "NULL";
      if (strays_ && OneIn(3)) {
        id = "-1";
      }
      sql.push_back("INSERT OR IGNORE INTO Folders VALUES(" +
                    (IsPlain(id) ? id : std::string("NULL")) + ", " + Number(Id()) + ", " +
                    Text(Any(paths_)) + ", 1, " + Text(Any(volumes_)) + ")");
    }
    for (std::size_t count = Below(14 * scale_); count > 0; --count) {
      const std::string id = oddIds_ ? Number(Id()) : "NULL";
      const std::string time = std::to_string(Below(1'000));
      sql.push_back("INSERT OR IGNORE INTO Files VALUES(" +
                    (IsPlain(id) ? id : std::string("NULL")) + ", " + Number(Id()) + ", " +
                    Text(Any(names_)) + ", " + time + ", " + Text(Any(volumes_)) + ", 1)");
    }
    if (oddSequences_) {
      AddSequences(sql);
    }
    if (isUntyped_) {
      sql.push_back(SetTypes());
    }
  }

  static bool IsPlain(const std::string& number) {
    return number.find_first_not_of("-0123456789") == std::string::npos;
  }

  void AddSequences(std::vector<std::string>& sql) {
    static const std::vector<std::string> changes{
        "DELETE FROM sqlite_sequence",
        "DELETE FROM sqlite_sequence WHERE name = 'Files'",
        "DELETE FROM sqlite_sequence WHERE name = 'Folders'",
        "UPDATE sqlite_sequence SET seq = 0",
        "UPDATE sqlite_sequence SET seq = -5",
        "UPDATE sqlite_sequence SET seq = 3.7",
        "UPDATE sqlite_sequence SET seq = 'text'",
        "UPDATE sqlite_sequence SET seq = NULL",
        "UPDATE sqlite_sequence SET seq = 9223372036854775804",
        "INSERT INTO sqlite_sequence VALUES('Files', 2), ('Folders', 3)"};
    // A schema without AUTOINCREMENT may have no such table.
    sql.emplace_back("CREATE TABLE sequenced(id INTEGER PRIMARY KEY AUTOINCREMENT)");
    sql.push_back(Any(changes));
    // Without its last row a table may use an id again.
    if (OneIn(2)) {
      sql.emplace_back("DELETE FROM Folders WHERE folder_id = (SELECT max(folder_id) FROM Folders) "
                       "AND folder_id != 1");
    }
    if (OneIn(4)) {
      sql.emplace_back("DELETE FROM Folders WHERE folder_id > -2");
    }
  }

  CatalogRow Row(const std::string& path, std::size_t removals) {
    const auto number = [this] { return static_cast<std::int32_t>(Below(2'000)) - 100; };
    return {.path = path,
            .isDeleted = OneIn(removals),
            .isSystem = OneIn(15),
            .modified = number(),
            .updated = number(),
            .status = number()};
  }

  CatalogMerge MakeMerge() {
    CatalogMerge merge{.volume = Any(volumes_), .since = static_cast<std::time_t>(Below(500))};
    static constexpr std::array<std::size_t, 4> shares{2, 3, 8, 1'000};
    std::size_t removals = OneIn(8) ? 1 : Any(shares);
    if (!OneIn(4)) {
      merge.folders.push_back({.path = merge.volume});
    }
    for (std::size_t count = Below(9 * scale_); count > 0; --count) {
      merge.folders.push_back(Row(Any(paths_), removals));
    }
    removals = OneIn(8) ? 1 : Any(shares);
    for (std::size_t count = Below(16 * scale_); count > 0; --count) {
      const std::string name = Any(names_);
      CatalogRow row = Row(Any(paths_) + name, removals);
      row.name = OneIn(8) ? Any(names_) : name;
      merge.files.push_back(row);
    }
    return merge;
  }

  MergeTransaction MakeTransaction() {
    MergeTransaction transaction{.isCommitted = !OneIn(5)};
    for (std::size_t count = 1 + Below(2); count > 0; --count) {
      transaction.merges.push_back(MakeMerge());
    }
    return transaction;
  }

  std::mt19937 random_;
  std::size_t scale_; ///< how many times as many rows
  bool oddPaths_ = false;
  bool oddTexts_ = false;
  bool oddIds_ = false;
  bool oddValues_ = false;
  bool oddSequences_ = false;
  bool strays_ = false; ///< ids that stand for a missing folder
  bool isUntyped_ = false;
  bool isForeign_ = false;
  std::vector<std::string> volumes_;
  std::vector<std::string> paths_; ///< of folders
  std::vector<std::string> names_; ///< of files
};

} // namespace

MergeCase MakeMergeCase(unsigned seed, std::size_t scale) {
  return Generator(seed, scale).Make();
}

// The comparison.

MergeList MakeMergeList(const std::vector<CatalogRow>& rows) {
  MergeList list;
  for (const CatalogRow& row : rows) {
    MergeItem& item = list.Add({}, row.path, row.name);
    item.modified = row.modified;
    item.updated = row.updated;
    item.status = row.status;
    item.isDeleted = row.isDeleted;
    item.isSystem = row.isSystem;
  }
  list.Sort();
  return list;
}

namespace {

constexpr const char* SINGLE = "/tmp/single";
constexpr const char* SETS = "/tmp/sets";

struct CloseHandle {
  void operator()(sqlite3* handle) const noexcept { sqlite3_close_v2(handle); }
};

/// The file of the case's database.
std::string MakeDatabase(const std::vector<std::string>& sql) {
  sqlite3* opened = nullptr;
  sqlite3_open_v2(":memory:", &opened, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, nullptr);
  const std::unique_ptr<sqlite3, CloseHandle> handle(opened);
  for (const std::string& statement : sql) {
    // Constraints of a schema refuse some rows, and numbers that are no integers some ids.
    sqlite3_exec(handle.get(), statement.c_str(), nullptr, nullptr, nullptr);
  }
  sqlite3_int64 size = 0;
  const std::unique_ptr<unsigned char, decltype(&sqlite3_free)> bytes(
      sqlite3_serialize(handle.get(), "main", &size, 0), &sqlite3_free);
  if (!bytes) {
    throw std::runtime_error("no database");
  }
  return {reinterpret_cast<const char*>(bytes.get()), static_cast<std::size_t>(size)};
}

template <typename Item>
Item MakeItem(const MergeItem& row) {
  Item item;
  item.path = row.Path();
  item.name = row.Name();
  item.lastModifiedDate = row.modified;
  return item;
}

void ApplySingleFolders(const PhotoDB& photos, const std::string& volume,
                        std::span<const MergeItem> rows) {
  for (const MergeItem& row : rows) {
    auto folder = MakeItem<db::Folder>(row);
    if (row.isDeleted) {
      photos.DeleteFolder(volume, folder);
    } else {
      photos.AddFolder(volume, folder);
    }
  }
}

std::time_t ApplySingleFiles(const PhotoDB& photos, const std::string& volume,
                             std::span<const MergeItem> rows, std::time_t since) {
  StandardOutput& output = StandardOutput::Current();
  std::time_t newest = since;
  for (const MergeItem& row : rows) {
    output.WriteLine({"Processing file ", row.Path(), " isdeleted=", row.isDeleted ? "1" : "0",
                      " status = ", std::to_string(row.status)});
    if (row.isSystem) {
      continue;
    }
    auto file = MakeItem<db::File>(row);
    if (row.isDeleted) {
      output.WriteLine({"Removing file ", row.Path(), " for mount ", volume});
      photos.DeleteFile(volume, file);
    } else {
      output.WriteLine({"Adding file ", row.Path(), " for mount ", volume});
      output.Flush();
      photos.AddFile(volume, file);
    }
    newest = std::max<std::time_t>(newest, row.updated);
  }
  output.Flush();
  return newest;
}

std::string Dump(const PhotoDB& photos) {
  std::string dump;
  for (const char* const sql :
       {"SELECT 'folder ' || quote(folder_id) || '|' || quote(parent_folder_id) || '|' || "
        "quote(name) || '|' || quote(CAST(name AS BLOB)) || '|' || quote(modified_date) || '|' || "
        "quote(volume) FROM Folders NOT INDEXED ORDER BY 1",
        "SELECT 'file ' || quote(file_id) || '|' || quote(folder_id) || '|' || quote(name) || '|' "
        "|| quote(CAST(name AS BLOB)) || '|' || quote(modified_date) || '|' || quote(volume) || "
        "'|' || quote(created_date) FROM Files NOT INDEXED ORDER BY 1",
        "SELECT 'sequence ' || quote(name) || '|' || quote(seq) FROM sqlite_sequence ORDER BY "
        "rowid",
        "SELECT 'schema ' || name FROM main.sqlite_schema ORDER BY rowid"}) {
    try {
      db::Statement query(photos, sql);
      while (query.Fetch()) {
        dump += query.GetText(0) + "\n";
      }
    } catch (const std::string& error) {
      dump += error + "\n"; // no AUTOINCREMENT
    }
  }
  return dump;
}

/// What can be observed of one transaction.
struct Effects {
  std::string lines;
  std::string rows; ///< after each merge
  bool hasFailed = false;
  std::string failure;
  std::string after; ///< the rows after the end of the transaction

  bool operator==(const Effects& other) const {
    // When it fails, a set may have more of its lines.
    return hasFailed == other.hasFailed && after == other.after &&
           (hasFailed || (lines == other.lines && rows == other.rows));
  }
};

Effects Run(PhotoDB& photos, const MergeTransaction& transaction, bool inSets) {
  const std::atomic<bool> stopRequested{false};
  Effects effects;
  CapturedOutput output;
  try {
    db::Transaction scope(photos, 1'000);
    for (const CatalogMerge& merge : transaction.merges) {
      const MergeList folders = MakeMergeList(merge.folders);
      const MergeList files = MakeMergeList(merge.files);
      std::time_t newest = 0;
      if (inSets) {
        const SetMerge sets(photos, merge.volume, stopRequested);
        sets.ApplyFolders(folders);
        newest = sets.ApplyFiles(files, merge.since);
      } else {
        ApplySingleFolders(photos, merge.volume, folders.Items());
        newest = ApplySingleFiles(photos, merge.volume, files.Items(), merge.since);
      }
      effects.rows += Dump(photos) + "newest " + std::to_string(newest) + "\n";
    }
    if (transaction.isCommitted) {
      scope.Commit();
    }
  } catch (const std::string& failure) {
    effects.hasFailed = true;
    effects.failure = failure;
    StandardOutput::Current().Flush();
  }
  effects.lines = output.Take();
  effects.after = Dump(photos);
  return effects;
}

std::string Describe(const Effects& effects) {
  return (effects.hasFailed ? "failure: " + effects.failure + "\n" : "") + "lines:\n" +
         effects.lines + "rows:\n" + effects.rows + "after the transaction:\n" + effects.after;
}

/// A PhotoDB whose statements call a function with their text when they begin.
class TracedPhotoDB : public PhotoDB {
public:
  using PhotoDB::PhotoDB;
  using Function = std::function<void(std::string_view sql)>;

  /// `function` lives as long as the database is used.
  void CallForStatements(Function& function) {
    const auto call = [](unsigned /*event*/, void* place, void* /*statement*/, void* sql) {
      (*static_cast<Function*>(place))(static_cast<const char*>(sql));
      return 0;
    };
    sqlite3_trace_v2(Handle(), SQLITE_TRACE_STMT, call, &function);
  }
};

class OpenCase {
public:
  OpenCase(const char* location, const std::string& database) {
    std::filesystem::create_directories(location + std::string("/.zophotos"));
    std::ofstream(location + std::string("/.zophotos/zophotos.db"), std::ios::binary) << database;
    photos_.emplace(location);
    try {
      photos_->Init();
    } catch (const std::string& refusal) {
      refusal_ = refusal;
    }
  }

  TracedPhotoDB& Photos() { return *photos_; }
  /// Why the database was refused; empty if it was not.
  const std::string& Refusal() const { return refusal_; }

private:
  std::optional<TracedPhotoDB> photos_;
  std::string refusal_;
};

} // namespace

std::string CompareMerges(const MergeCase& merge) {
  const std::string database = MakeDatabase(merge.database);
  OpenCase single(SINGLE, database);
  OpenCase sets(SETS, database);
  if (!single.Refusal().empty()) {
    return "refused: " + single.Refusal();
  }
  for (const MergeTransaction& transaction : merge.transactions) {
    const Effects expected = Run(single.Photos(), transaction, false);
    const Effects actual = Run(sets.Photos(), transaction, true);
    if (!(actual == expected)) {
      return "with single rows\n" + Describe(expected) + "but with sets\n" + Describe(actual);
    }
  }
  return {};
}

namespace {

/// What can be observed of the first merge of a case, up to some of its rows.
Effects RunPart(const std::string& database, const CatalogMerge& merge, std::size_t folderCount,
                std::size_t fileCount) {
  OpenCase open(SINGLE, database);
  const MergeList folders = MakeMergeList(merge.folders);
  const MergeList files = MakeMergeList(merge.files);
  Effects effects;
  CapturedOutput output;
  ApplySingleFolders(open.Photos(), merge.volume, folders.Items().first(folderCount));
  const std::time_t newest =
      ApplySingleFiles(open.Photos(), merge.volume, files.Items().first(fileCount), merge.since);
  effects.lines = output.Take();
  effects.rows = Dump(open.Photos()) + "newest " + std::to_string(newest) + "\n";
  return effects;
}

/// The same in sets with a stop request when the statement with that number begins. Returns none
/// if there are not so many. `wasInSet` tells whether that is the statement of a set.
std::optional<Effects> RunWithStop(const std::string& database, const CatalogMerge& merge,
                                   int statement, bool& wasInSet) {
  OpenCase open(SETS, database);
  const MergeList folders = MakeMergeList(merge.folders);
  const MergeList files = MakeMergeList(merge.files);
  Effects effects;
  std::atomic<bool> stopRequested{statement == 0};
  TracedPhotoDB::Function count = [&](std::string_view sql) {
    if (!stopRequested && --statement == 0) {
      stopRequested = true;
      wasInSet = sql.find("temp.input") != std::string_view::npos;
    }
  };
  CapturedOutput output;
  const SetMerge sets(open.Photos(), merge.volume, stopRequested);
  open.Photos().CallForStatements(count);
  sets.ApplyFolders(folders);
  const std::time_t newest = sets.ApplyFiles(files, merge.since);
  if (!stopRequested) {
    return std::nullopt;
  }
  effects.lines = output.Take();
  effects.rows = Dump(open.Photos()) + "newest " + std::to_string(newest) + "\n";
  return effects;
}

} // namespace

std::string CompareStoppedMerges(const MergeCase& merge, MiddleStops& stops) {
  const std::string database = MakeDatabase(merge.database);
  const CatalogMerge& merged = merge.transactions.front().merges.front();
  std::vector<Effects> parts;
  for (std::size_t count = 0; count <= merged.folders.size(); ++count) {
    parts.push_back(RunPart(database, merged, count, 0));
  }
  for (std::size_t count = 1; count <= merged.files.size(); ++count) {
    parts.push_back(RunPart(database, merged, merged.folders.size(), count));
  }
  for (int statement = 0;; ++statement) {
    bool wasInSet = false;
    const std::optional<Effects> effects = RunWithStop(database, merged, statement, wasInSet);
    if (!effects) {
      return {};
    }
    const auto first = std::ranges::find(parts, *effects);
    if (first == parts.end() || (statement == 0 && first != parts.begin())) {
      return "stopped at statement " + std::to_string(statement) + "\n" + Describe(*effects);
    }
    // Rows without effects make equal parts.
    const auto last = std::find(parts.rbegin(), parts.rend(), *effects).base() - 1;
    const auto noFile = parts.begin() + std::ssize(merged.folders);
    stops.folders += wasInSet && first != parts.begin() && last < noFile ? 1 : 0;
    stops.files += wasInSet && first > noFile && last != parts.end() - 1 ? 1 : 0;
  }
}

// A case for a message.

namespace {

/// Leaves out parts of `parts`, from the element `first` on, without which the case, of which they
/// are a part, still has a difference.
template <typename Parts>
bool ReduceParts(const MergeCase& merge, Parts& parts, std::size_t first = 0) {
  bool isReduced = false;
  for (std::size_t i = parts.size(); i > first; --i) {
    const Parts all = parts;
    parts.erase(parts.begin() + static_cast<std::ptrdiff_t>(i - 1));
    if (CompareMerges(merge).empty()) {
      parts = all;
    } else {
      isReduced = true;
    }
  }
  return isReduced;
}

} // namespace

MergeCase Reduce(MergeCase merge) {
  bool isReduced = true;
  while (isReduced) {
    isReduced = ReduceParts(merge, merge.transactions);
    for (MergeTransaction& transaction : merge.transactions) {
      isReduced = ReduceParts(merge, transaction.merges) || isReduced;
      for (CatalogMerge& each : transaction.merges) {
        isReduced = ReduceParts(merge, each.folders) || isReduced;
        isReduced = ReduceParts(merge, each.files) || isReduced;
      }
    }
    isReduced = ReduceParts(merge, merge.database, merge.schemaSize) || isReduced;
  }
  return merge;
}

std::string Describe(const MergeCase& merge) {
  std::string text;
  for (const std::string& sql : merge.database) {
    text += sql + ";\n";
  }
  const auto describe = [&](const char* kind, const CatalogRow& row) {
    text += std::string(row.isDeleted ? "    remove " : "    add ") + kind + SqlText(row.path) +
            " named " + SqlText(row.name) + (row.isSystem ? ", a system file" : "") +
            ", modified " + std::to_string(row.modified) + ", updated " +
            std::to_string(row.updated) + "\n";
  };
  for (const MergeTransaction& transaction : merge.transactions) {
    text += transaction.isCommitted ? "transaction\n" : "transaction that is rolled back\n";
    for (const CatalogMerge& each : transaction.merges) {
      text += "  merge of " + each.volume + " since " + std::to_string(each.since) + "\n";
      for (const CatalogRow& row : each.folders) {
        describe("folder ", row);
      }
      for (const CatalogRow& row : each.files) {
        describe("file ", row);
      }
    }
  }
  return text;
}

} // namespace orva::test
