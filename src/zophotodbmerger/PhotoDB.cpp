#include "stdafx.h"

#include "PhotoDB.h"

#include "File.h"
#include "Folder.h"
#include "StandardOutput.h"
#include "Statistics.h"

#include "orvadb/ErrorMessage.h"
#include "orvadb/File.h"
#include "orvadb/Folder.h"
#include "orvadb/Statement.h"
#include "orvadb/Transaction.h"

#include "orvautil/Exception.h"
#include "orvautil/FileDescriptor.h"
#include "orvautil/FormatString.h"
#include "orvautil/Path.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>

namespace orva::dbmerger {

namespace {

using db::Statement;

constexpr unsigned DIRECTORY_PERMISSIONS = 0775;
/// Programs that read the database run as other users, and SQLite makes files in the directory for
/// readers, too.
constexpr mode_t EVERYBODY = 0777;

/// Stored in a new database's status row: a fixed placeholder, not the clock.
constexpr std::time_t NEW_DATABASE_TIME = 1000;

/// Milliseconds that a removal waits for other users of the database.
constexpr unsigned BUSY_TIMEOUT = 1000;

// The statements of the tables and indexes that merges work on. SQLite keeps their texts, which
// HasOwnSchema compares.
const char* const CREATE_FOLDERS =
    "CREATE TABLE IF NOT EXISTS Folders(folder_id INTEGER PRIMARY KEY AUTOINCREMENT, "
    "parent_folder_id INTEGER NOT NULL, name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume "
    "TEXT NOT NULL)";
const char* const CREATE_FILES =
    "CREATE TABLE IF NOT EXISTS Files(file_id INTEGER PRIMARY KEY AUTOINCREMENT, folder_id INTEGER "
    "NOT NULL, name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume TEXT NOT NULL, "
    "created_date INTEGER NOT NULL, FOREIGN KEY(folder_id) REFERENCES Folders(folder_id) ON DELETE "
    "CASCADE)";
constexpr std::array<const char*, 4> CREATE_INDEXES{
    "CREATE INDEX IF NOT EXISTS Folders_folderId ON Folders(parent_folder_id)",
    "CREATE INDEX IF NOT EXISTS Folders_path ON Folders(name)",
    "CREATE INDEX IF NOT EXISTS Files_folderId ON Files(folder_id)",
    "CREATE INDEX IF NOT EXISTS Files_name ON Files(name)"};

/// Whether anything exists at `path`, links not followed.
bool IsPresent(const std::string& path) {
  struct stat status {};
  return lstat(path.c_str(), &status) == 0;
}

bool IsDirectory(const std::string& path) {
  struct stat status {};
  return lstat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

struct CloseDirectory {
  void operator()(DIR* directory) const noexcept { closedir(directory); }
};

/// Whether an open directory has no entries.
bool IsEmpty(int directory) {
  util::FileDescriptor listed(openat(directory, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  const std::unique_ptr<DIR, CloseDirectory> entries(fdopendir(listed.Get()));
  if (!entries) {
    return false;
  }
  static_cast<void>(listed.Release()); // closedir closes it
  const dirent* entry = readdir(entries.get());
  while (entry != nullptr && std::string_view("..").starts_with(entry->d_name)) {
    entry = readdir(entries.get());
  }
  return entry == nullptr;
}

/// Whether the directory `name` can be the one that the daemon has just created; `status` is its
/// status. Some file systems report one owner for everything.
bool CanBeNew(int base, const std::string& name, const struct stat& status) {
  struct stat location {};
  return S_ISDIR(status.st_mode) &&
         (status.st_uid == geteuid() || (fstatat(base, (name + "/..").c_str(), &location, 0) == 0 &&
                                         status.st_uid == location.st_uid));
}

/// Creates the directory at `path` for everybody to write. Returns whether it was created.
bool CreateDirectoryForEverybody(const std::string& path) {
  if (!util::Path(path).Create(DIRECTORY_PERMISSIONS)) {
    return false;
  }
  // Every user may rename what is in the root of a volume. Another directory may have this name
  // now. Its mode must not change.
  const util::FileDescriptor directory(
      open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  const int base = directory ? directory.Get() : AT_FDCWD;
  const std::string name = directory ? "." : path;
  struct stat created {};
  if (fstatat(base, name.c_str(), &created, AT_SYMLINK_NOFOLLOW) != 0 ||
      !CanBeNew(base, name, created)) {
    return false;
  }
  if (directory && IsEmpty(directory.Get()) && fchmod(directory.Get(), EVERYBODY) == 0) {
    return true;
  }
  // Otherwise the next attempt would accept the directory with the wrong mode.
  struct stat present {};
  if (lstat(path.c_str(), &present) == 0 && present.st_dev == created.st_dev &&
      present.st_ino == created.st_ino) {
    rmdir(path.c_str());
  }
  return false;
}

/// The text between the last two separators of a folder's path.
std::string FolderName(const std::string& path) {
  const std::size_t end = path.rfind(NATIVE_PATH_SEPARATOR);
  if (end == std::string::npos) {
    return path;
  }
  const std::size_t begin = end == 0 ? 0 : path.rfind(NATIVE_PATH_SEPARATOR, end - 1) + 1;
  return path.substr(begin, end - begin);
}

// Times are 32-bit integers for every reader of the merged database.

std::unique_ptr<Folder> ReadFolder(const Statement& row) {
  auto folder = std::make_unique<Folder>();
  folder->folder_id = row.GetInt64(0);
  folder->parent_folder_id = row.GetInt64(1);
  folder->name = row.GetText(2);
  folder->folder_name = FolderName(folder->name);
  folder->modified_date = row.GetInt(3);
  folder->volume = row.GetText(4);
  return folder;
}

std::unique_ptr<File> ReadFile(const Statement& row) {
  auto file = std::make_unique<File>();
  file->file_id = row.GetInt64(0);
  file->folder_id = row.GetInt64(1);
  file->name = row.GetText(2);
  file->modified_date = row.GetInt(3);
  file->volume = row.GetText(4);
  file->created_date = row.GetInt(5);
  return file;
}

/// Whether a step's result code is no failure.
bool IsSuccess(int code) {
  return code == 0 || code == Statement::ROW || code == Statement::DONE;
}

/// Whether the schema has the table or index that `create` makes.
bool HasObject(const PhotoDB& photos, std::string create) {
  // The text that SQLite keeps.
  const std::string_view condition = "IF NOT EXISTS ";
  create.erase(create.find(condition), condition.size());
  Statement query(photos, "SELECT 1 FROM main.sqlite_schema WHERE sql = ?");
  query.BindText(1, create);
  return query.Fetch();
}

/// Whether new folders and files get positive ids. Throws std::string if SQLite would search long
/// for the next one, each time.
bool HasOwnSequences(const PhotoDB& photos) {
  constexpr long long mostSequences = 1'000;
  if (!HasObject(photos, "CREATE TABLE IF NOT EXISTS sqlite_sequence(name,seq)")) {
    return false;
  }
  // Not by count(*), which no limit ends.
  Statement next(photos, "SELECT 1 FROM main.sqlite_sequence LIMIT 1 OFFSET ?");
  next.BindInt64(1, mostSequences);
  if (next.Fetch()) {
    throw db::ErrorMessage(
        util::FormatString("too many sequences in '%s'", photos.GetPath().c_str()));
  }
  Statement query(photos, "SELECT 1 FROM main.sqlite_sequence WHERE name IN ('Folders', 'Files') "
                          "AND (typeof(seq) != 'integer' OR seq < 0)");
  return !query.Fetch();
}

/// The caller's transaction, or else one of its own.
class JoinedTransaction {
public:
  explicit JoinedTransaction(const db::DB& db) {
    if (!db.IsInTransaction()) {
      own_.emplace(db, BUSY_TIMEOUT);
    }
  }

  bool IsOwn() const noexcept { return own_.has_value(); }

  void Commit() {
    if (own_) {
      own_->Commit();
    }
  }

private:
  std::optional<db::Transaction> own_;
};

/// Appends `record` to a list of the caller, which then owns it.
template <typename Record>
void HandOver(std::unique_ptr<Record> record, std::vector<Record*>& records) {
  records.push_back(record.get());
  static_cast<void>(record.release());
}

} // namespace

std::string_view ParentPath(std::string_view path) {
  return path.substr(0, path.rfind('/', path.size() - 2) + 1);
}

std::string_view FolderPath(std::string_view path) {
  return path.substr(0, path.rfind('/') + 1);
}

PhotoDB::PhotoDB(const std::string& location)
    : dbLocation(util::MakePath(util::Path(location).Canonicalize(), ".zophotos")) {
  if (!IsPresent(dbLocation) && !CreateDirectoryForEverybody(dbLocation)) {
    throw util::Exception(
        util::FormatString("Change permissions failed on dbLocation: '%s'", dbLocation.c_str()));
  }
  if (!IsDirectory(dbLocation)) {
    throw Error("Invalid DB location : '" + dbLocation + "'");
  }
}

std::string PhotoDB::FilePath() const {
  return util::MakePath(dbLocation, PHOTO_DB_NAME);
}

void PhotoDB::Init() {
  const std::string path = FilePath();
  const bool existed = IsPresent(path);
  if (!existed) {
    Create(path, [this] {
      CreateTables();
      CreateIndices();
    });
  }
  Open(path);
  if (existed) {
    for (const char* const table : {"Status", "Statistics", "Folders", "Files"}) {
      RejectComputedColumns(table);
    }
    LoadStatus();
  }
}

void PhotoDB::LoadStatus() {
  Statement query(*this, "SELECT * FROM Status");
  if (query.Fetch()) {
    status.id = query.GetInt64(0);
    status.mc_version = query.GetText(1);
    status.mdate = query.GetInt(2);
    status.etype = query.GetInt(4);
    status.desc = query.GetText(3);
  }
}

void PhotoDB::CreateTables() {
  Statement(*this,
            "CREATE TABLE IF NOT EXISTS Status(id INTEGER PRIMARY KEY AUTOINCREMENT, mc_version "
            "CHAR(16) NOT NULL, mdate INTEGER NOT NULL, desc CHAR(80), etype INTEGER)")
      .Execute();
  Statement(*this,
            "CREATE TABLE IF NOT EXISTS Statistics(id INTEGER PRIMARY KEY AUTOINCREMENT, volume "
            "TEXT NOT NULL, photos_xcoded INTEGER NOT NULL, photos_total INTEGER NOT NULL, "
            "last_updated_time INTEGER NOT NULL)")
      .Execute();

  status.mc_version = "2.0";
  status.mdate = NEW_DATABASE_TIME;
  status.desc.clear();
  status.etype = 0;
  Statement insertStatus(*this,
                         "INSERT INTO Status(mc_version, mdate, desc, etype) VALUES(?, ?, ?, ?)");
  insertStatus.BindText(1, status.mc_version);
  insertStatus.BindTime(2, status.mdate);
  insertStatus.BindText(3, status.desc);
  insertStatus.BindInt(4, status.etype);
  insertStatus.Execute();

  Statement(*this, CREATE_FOLDERS).Execute();

  // The root folder, the parent of every volume. It gets id 1 because the table is new;
  // DeleteVolumes relies on that.
  Statement insertRoot(
      *this,
      "INSERT INTO Folders(parent_folder_id, name, modified_date, volume) VALUES(?, ?, ?, ?)");
  insertRoot.BindInt(1, -1);
  insertRoot.BindText(2, "/shares/");
  insertRoot.BindTime(3, 0);
  insertRoot.BindText(4, "<DUMMY>");
  insertRoot.Execute();

  Statement(*this, CREATE_FILES).Execute();
}

void PhotoDB::CreateIndices() {
  for (const char* const sql : CREATE_INDEXES) {
    Statement(*this, sql).Execute();
  }
}

bool PhotoDB::HasOwnSchema() const {
  Statement encoding(*this, "PRAGMA encoding");
  return encoding.Fetch() && encoding.GetTextView(0) == "UTF-8" &&
         HasObject(*this, CREATE_FOLDERS) && HasObject(*this, CREATE_FILES) &&
         std::ranges::all_of(CREATE_INDEXES,
                             [this](const char* create) { return HasObject(*this, create); }) &&
         HasOwnSequences(*this);
}

void PhotoDB::Clear() {
  const std::string path = FilePath();
  // SQLite must not have the file open when it is removed.
  Close();
  unlink(path.c_str());
  Open(path);
}

void PhotoDB::DumpTable(const std::string& /*table*/) const {}

std::unique_ptr<Folder> PhotoDB::GetFolder(long long folderId) const {
  Statement query(*this, "SELECT * FROM Folders WHERE folder_id = ?");
  query.BindInt64(1, folderId);
  return query.Fetch() ? ReadFolder(query) : nullptr;
}

std::unique_ptr<Folder> PhotoDB::GetFolder(const std::string& name,
                                           const std::string& volume) const {
  // The unary plus keeps SQLite from using an index on the volume.
  Statement query(*this, "SELECT * FROM Folders WHERE name = ? AND +volume = ?");
  query.BindText(1, name);
  query.BindText(2, volume);
  return query.Fetch() ? ReadFolder(query) : nullptr;
}

std::optional<long long> PhotoDB::FindFolder(std::string_view path) const {
  Statement query(*this, "select * FROM Folders where name = ?");
  query.BindTextView(1, path);
  return query.Fetch() ? std::optional(query.GetInt64(0)) : std::nullopt;
}

std::optional<long long> PhotoDB::FindFolder(std::string_view path, std::string_view volume) const {
  Statement query(*this, "select * FROM Folders where name = ? and volume = ?");
  query.BindTextView(1, path);
  query.BindTextView(2, volume);
  return query.Fetch() ? std::optional(query.GetInt64(0)) : std::nullopt;
}

void PhotoDB::AddFolder(std::string volume, db::Folder& folder) const {
  {
    Statement query(*this, "SELECT * FROM Folders where name = ?");
    query.BindTextView(1, folder.path);
    if (query.Fetch()) {
      return;
    }
  }
  const long long parentId = FindFolder(ParentPath(folder.path)).value_or(NO_FOLDER);
  if (parentId == NO_FOLDER) {
    return;
  }
  Statement insert(
      *this,
      "INSERT INTO Folders(parent_folder_id, name, modified_date, volume) VALUES(?, ?, ?, ?)");
  insert.BindInt64(1, parentId);
  insert.BindTextView(2, folder.path);
  insert.BindTime(3, folder.lastModifiedDate);
  insert.BindTextView(4, volume);
  insert.Execute();
}

void PhotoDB::DeleteVolumes() const {
  JoinedTransaction transaction(*this);
  for (const char* const sql : {"DELETE FROM Folders WHERE folder_id != 1", "DELETE FROM Files ",
                                "DELETE FROM Statistics"}) {
    Statement(*this, sql).Execute();
  }
  transaction.Commit();
  if (transaction.IsOwn()) {
    Statement(*this, "VACUUM").Execute();
  }
}

void PhotoDB::DeleteVolume(const std::string& volume) const {
  JoinedTransaction transaction(*this);
  for (const char* const sql :
       {"DELETE FROM Folders WHERE volume = ?", "DELETE FROM Files WHERE volume = ?",
        "UPDATE Statistics SET last_updated_time = 0 WHERE volume = ?"}) {
    Statement change(*this, sql);
    change.BindText(1, volume);
    change.Execute();
  }
  transaction.Commit();
}

std::unique_ptr<File> PhotoDB::GetFile(long long fileId) const {
  Statement query(*this, "SELECT * FROM Files WHERE file_id = ?");
  query.BindInt64(1, fileId);
  return query.Fetch() ? ReadFile(query) : nullptr;
}

void PhotoDB::AddFile(const std::string& volume, db::File& file) const {
  const std::string_view folderPath = FolderPath(file.path);
  {
    Statement query(*this,
                    "SELECT * FROM Files f, Folders o where f.folder_id = o.folder_id and f.name = "
                    "? and o.name = ? and f.volume = ?");
    query.BindTextView(1, file.name);
    query.BindTextView(2, folderPath);
    query.BindTextView(3, volume);
    if (query.Fetch()) {
      return;
    }
  }
  const long long folderId = FindFolder(folderPath, volume).value_or(NO_FOLDER);
  if (folderId == NO_FOLDER) {
    return;
  }
  Statement insert(*this, "INSERT INTO Files(folder_id, name, modified_date, volume, created_date) "
                          "VALUES(?, ?, ?, ?, ?)");
  insert.BindInt64(1, folderId);
  insert.BindTextView(2, file.name);
  insert.BindTime(3, file.lastModifiedDate);
  insert.BindTextView(4, volume);
  // For readers a photo was created when it was last modified.
  insert.BindTime(5, file.lastModifiedDate);
  insert.Execute();
}

void PhotoDB::DeleteFolder(const std::string& volume, db::Folder& folder) const {
  StandardOutput& output = StandardOutput::Current();
  const FlushAtEnd flush(output);
  output.WriteLine({"Deleting ", folder.path});
  const std::optional<long long> folderId = FindFolder(folder.path, volume);
  if (folderId) {
    output.WriteLine({"Found folder ", std::to_string(*folderId), " for ", folder.path});
  }
  output.Flush();
  for (const char* const sql :
       {"DELETE FROM Files WHERE folder_id = ?", "DELETE FROM Folders WHERE folder_id = ?"}) {
    Statement change(*this, sql);
    change.BindInt64(1, folderId.value_or(NO_FOLDER));
    change.Execute();
  }
}

void PhotoDB::DeleteFile(const std::string& /*volume*/, db::File& file) const {
  StandardOutput& output = StandardOutput::Current();
  const FlushAtEnd flush(output);
  output.WriteLine({"Deleting ", file.path});
  const std::optional<long long> folderId = FindFolder(FolderPath(file.path));
  if (folderId) {
    output.WriteLine({"Found parent folder ", std::to_string(*folderId), " for ", file.path});
  }
  output.Flush();
  Statement change(*this, "DELETE FROM Files WHERE name = ? and folder_id = ?");
  change.BindTextView(1, file.name);
  change.BindInt64(2, folderId.value_or(NO_FOLDER));
  change.Execute();
}

void PhotoDB::GetFolderFiles(long long folderId, std::vector<File*>& files) const {
  Statement query(*this, "SELECT * FROM Files WHERE folder_id = ? ");
  query.BindInt64(1, folderId);
  while (query.Fetch()) {
    HandOver(ReadFile(query), files);
  }
}

void PhotoDB::GetFolderFolders(long long parentId, const std::string& volume,
                               std::vector<Folder*>& folders) const {
  Statement query(*this, "SELECT * FROM Folders WHERE parent_folder_id = ?  AND +volume = ?");
  query.BindInt64(1, parentId);
  query.BindText(2, volume);
  while (query.Fetch()) {
    HandOver(ReadFolder(query), folders);
  }
}

std::unique_ptr<Statistics> PhotoDB::GetStatistics(std::string volume) const {
  Statement query(*this, "SELECT * FROM Statistics WHERE volume = ?");
  query.BindText(1, volume);
  if (query.Step() != Statement::ROW) {
    return nullptr;
  }
  auto statistics = std::make_unique<Statistics>();
  statistics->volume = query.GetText(1);
  // Counts are 32-bit integers for readers, although all 64 bits are stored.
  statistics->photos_xcoded = query.GetInt(2);
  statistics->photos_total = query.GetInt(3);
  statistics->last_updated_time = query.GetTime(4);
  return statistics;
}

void PhotoDB::InsertStatistics(const std::string& volume) {
  Statement insert(*this, "INSERT INTO Statistics(volume, photos_xcoded, photos_total, "
                          "last_updated_time) values (?, 0, 0, 0)");
  insert.BindText(1, volume);
  if (!IsSuccess(insert.Step())) {
    syslog(LOG_LOCAL1 | LOG_ERR, "Could not insert stats for %s ", volume.c_str());
  }
}

void PhotoDB::UpdateStatistics(const Statistics& stats) {
  Statement update(*this,
                   "UPDATE Statistics SET photos_xcoded = ?, photos_total = ?, last_updated_time = "
                   "? where volume = ?");
  update.BindInt64(1, stats.photos_xcoded);
  update.BindInt64(2, stats.photos_total);
  update.BindTime(3, stats.last_updated_time);
  update.BindText(4, stats.volume);
  const int code = update.Step();
  if (!IsSuccess(code)) {
    syslog(LOG_LOCAL1 | LOG_ERR, "Could not update stats for %s. Return code %d",
           stats.volume.c_str(), code);
  }
}

void PhotoDB::UpdateStatus() const {
  Statement update(*this,
                   "UPDATE Status SET mc_version = ?, mdate = ?, desc = ?, etype = ? WHERE id = 1");
  update.BindText(1, status.mc_version);
  update.BindTime(2, status.mdate);
  update.BindText(3, status.desc);
  update.BindInt(4, status.etype);
  update.Execute();
}

} // namespace orva::dbmerger
