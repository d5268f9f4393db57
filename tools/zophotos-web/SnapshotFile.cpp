#include "SnapshotFile.h"

#include <SQLiteCpp/Column.h>
#include <SQLiteCpp/Exception.h>
#include <sqlite3.h>

#include <algorithm>
#include <array>
#include <tuple>
#include <utility>

namespace orva::web {

namespace {

/// Marks the file as ours; the second number changes with the tables.
constexpr int APPLICATION = 0x5A505753;
constexpr int FORMAT = 2;

/// A crafted database may have any number of volumes.
constexpr std::int64_t MOST_VOLUMES = 1'000;

/// Bytes of the words of folders to keep.
constexpr std::size_t MOST_FOLDER_WORDS = 8 << 20;

/// Levels of a path to search for a folder that exists.
constexpr int MOST_LEVELS = 32;

/// Bytes of new entries that FTS5 collects in memory.
constexpr int COLLECTED_ENTRIES = 4 << 20;

constexpr int PAGES_TO_TIDY = 100;

constexpr const char* TABLES = R"(
CREATE TABLE State(version INTEGER, folder INTEGER, file INTEGER, photos INTEGER, folders INTEGER,
  filesLeftOut INTEGER, foldersLeftOut INTEGER, changes INTEGER, firstNumber INTEGER, boot TEXT,
  sourceFile TEXT, sourceContent TEXT, isComplete INTEGER);
CREATE TABLE Photos(id INTEGER PRIMARY KEY, folder INTEGER, volume INTEGER, name TEXT);
CREATE TABLE Folders(id INTEGER PRIMARY KEY, parent INTEGER, path TEXT, volume INTEGER);
CREATE INDEX FoldersByParent ON Folders(parent, path);
CREATE INDEX FoldersByPath ON Folders(path);
CREATE INDEX FoldersByVolume ON Folders(volume);
CREATE TABLE Volumes(number INTEGER PRIMARY KEY, mountPoint TEXT UNIQUE);
CREATE TABLE Statistics(mountPoint TEXT PRIMARY KEY, transcoded INTEGER, total INTEGER,
  mergedUpTo INTEGER, isGone INTEGER) WITHOUT ROWID;
CREATE TABLE Prefixes(prefix TEXT PRIMARY KEY) WITHOUT ROWID;
INSERT INTO State VALUES(0, 0, 0, 0, 0, 0, 0, 0, 0, '', '', '', 0);
)";

void Configure(SQLite::Database& database) {
  database.exec("PRAGMA synchronous = OFF; PRAGMA temp_store = MEMORY; PRAGMA cache_size = -8000");
}

/// Binds a text that stays valid until the statement is reset.
void BindText(SQLite::Statement& statement, int index, const std::string& text) {
  statement.bindNoCopy(index, text);
}

std::int64_t NumberIn(SQLite::Database& database, const std::string& sql) {
  return database.execAndGet(sql).getInt64();
}

bool IsSnapshot(SQLite::Database& database) {
  return NumberIn(database, "PRAGMA application_id") == APPLICATION &&
         NumberIn(database, "PRAGMA user_version") == FORMAT &&
         NumberIn(database, "SELECT isComplete FROM State") == 1;
}

/// The part of a folder's path below its volume.
std::string_view BelowVolume(std::string_view path, std::string_view volume) {
  return path.starts_with(volume) ? path.substr(volume.size()) : path;
}

} // namespace

SQLite::Database OpenForReading(const std::string& path) {
  SQLite::Database database(path, SQLite::OPEN_READONLY, 1000);
  database.exec("PRAGMA temp_store = MEMORY; PRAGMA cache_size = -2000");
  return database;
}

FrequentPrefixes ReadFrequentPrefixes(SQLite::Database& database) {
  std::vector<std::string> prefixes;
  SQLite::Statement query(database, "SELECT prefix FROM Prefixes ORDER BY length(prefix), prefix");
  while (query.executeStep()) {
    prefixes.push_back(query.getColumn(0).getString());
  }
  return FrequentPrefixes(prefixes);
}

std::int64_t FirstNumber(const SourceIdentity& source) {
  // FNV-1a, then mixed: the identities of two files differ in a few digits.
  std::uint64_t hash = 0xCBF2'9CE4'8422'2325;
  for (const char c : source.file) {
    hash = (hash ^ static_cast<unsigned char>(c)) * 0x100'0000'01B3;
  }
  hash = (hash ^ hash >> 33) * 0xFF51'AFD7'ED55'8CCD;
  return static_cast<std::int64_t>(hash >> 34);
}

void PhotoBatch::Add(std::int64_t id, const FileRow& file, std::int64_t volume) {
  rows_.push_back({.id = id,
                   .folder = file.folder,
                   .volume = static_cast<std::uint32_t>(volume),
                   .nameSize = static_cast<std::uint32_t>(file.name.size()),
                   .name = names_.size()});
  names_ += file.name;
}

void PhotoBatch::Sort() {
  std::ranges::sort(rows_, {}, &Row::id);
}

void PhotoBatch::Clear() {
  rows_.clear();
  names_.clear();
}

SnapshotFile::SnapshotFile(std::string path, SQLite::Database database)
    : path_(std::move(path)), database_(std::move(database)) {}

SnapshotFile SnapshotFile::Create(const std::string& path) {
  SnapshotFile file(path, SQLite::Database(path, SQLite::OPEN_READWRITE | SQLite::OPEN_CREATE));
  Configure(file.database_);
  file.database_.exec("PRAGMA journal_mode = OFF");
  file.database_.exec("PRAGMA application_id = " + std::to_string(APPLICATION) +
                      "; PRAGMA user_version = " + std::to_string(FORMAT));
  file.database_.exec(TABLES);
  file.database_.exec(std::string("CREATE VIRTUAL TABLE Search USING ") + SEARCH_INDEX);
  SQLite::Statement option(file.database_, "INSERT INTO Search(Search, rank) VALUES(?, ?)");
  // Parts are merged by Tidy instead.
  for (const auto& [name, value] : {std::pair("hashsize", COLLECTED_ENTRIES),
                                    std::pair("automerge", 0), std::pair("crisismerge", 1000)}) {
    option.bind(1, name);
    option.bind(2, value);
    option.exec();
    option.reset();
  }
  return file;
}

std::optional<SnapshotFile> SnapshotFile::Open(const std::string& path) {
  try {
    SnapshotFile file(path, SQLite::Database(path, SQLite::OPEN_READWRITE));
    if (!IsSnapshot(file.database_)) {
      return std::nullopt;
    }
    Configure(file.database_);
    file.LoadState();
    file.frequent_ = ReadFrequentPrefixes(file.database_);
    return file;
  } catch (const SQLite::Exception&) {
    return std::nullopt;
  }
}

std::int64_t SnapshotFile::Bytes() {
  return NumberIn(database_, "PRAGMA page_count") * NumberIn(database_, "PRAGMA page_size");
}

SQLite::Statement& SnapshotFile::Prepared(const char* sql) {
  auto found = statements_.find(std::string_view(sql));
  if (found == statements_.end()) {
    found = statements_
                .emplace(std::piecewise_construct, std::forward_as_tuple(sql),
                         std::forward_as_tuple(database_, sql))
                .first;
  }
  found->second.reset();
  return found->second;
}

void SnapshotFile::LoadState() {
  SQLite::Statement row(database_, "SELECT version, folder, file, photos, folders, filesLeftOut, "
                                   "foldersLeftOut, changes, firstNumber, boot, sourceFile, "
                                   "sourceContent FROM State");
  row.executeStep();
  state_ = {
      .version = row.getColumn(0).getInt64(),
      .position = {.folder = row.getColumn(1).getInt64(), .file = row.getColumn(2).getInt64()},
      .photos = row.getColumn(3).getInt64(),
      .folders = row.getColumn(4).getInt64(),
      .filesLeftOut = row.getColumn(5).getInt64(),
      .foldersLeftOut = row.getColumn(6).getInt64(),
      .changes = row.getColumn(7).getInt64(),
      .firstNumber = row.getColumn(8).getInt64(),
      .boot = row.getColumn(9).getString(),
      .source = {.file = row.getColumn(10).getString(), .content = row.getColumn(11).getString()}};
}

void SnapshotFile::SaveState() {
  SQLite::Statement& update =
      Prepared("UPDATE State SET version = ?, folder = ?, file = ?, photos = ?, folders = ?, "
               "filesLeftOut = ?, foldersLeftOut = ?, changes = ?, firstNumber = ?, boot = ?, "
               "sourceFile = ?, "
               "sourceContent = ?");
  int index = 0;
  for (const std::int64_t number :
       {state_.version, state_.position.folder, state_.position.file, state_.photos, state_.folders,
        state_.filesLeftOut, state_.foldersLeftOut, state_.changes, state_.firstNumber}) {
    update.bind(++index, number);
  }
  update.bind(++index, state_.boot);
  update.bind(++index, state_.source.file);
  update.bind(++index, state_.source.content);
  update.exec();
}

void SnapshotFile::Begin() {
  database_.exec("BEGIN IMMEDIATE");
}

void SnapshotFile::Commit() {
  SaveState();
  database_.exec("COMMIT");
}

void SnapshotFile::Rollback() {
  for (auto& [sql, statement] : statements_) {
    statement.reset();
  }
  if (sqlite3_get_autocommit(database_.getHandle()) == 0) {
    database_.exec("ROLLBACK");
  }
  volumes_.clear();
  folderWords_.clear();
  folderWordsSize_ = 0;
  LoadState();
}

std::optional<std::int64_t> SnapshotFile::VolumeNumber(std::string_view mountPoint) {
  const auto found = volumes_.find(mountPoint);
  if (found != volumes_.end()) {
    return found->second;
  }
  const std::string text(mountPoint);
  SQLite::Statement& query = Prepared("SELECT number FROM Volumes WHERE mountPoint = ?");
  BindText(query, 1, text);
  std::int64_t number = 0;
  if (query.executeStep()) {
    number = query.getColumn(0).getInt64();
  } else {
    // No row is ever removed.
    if (NumberIn(database_, "SELECT ifnull(max(number), 0) FROM Volumes") >= MOST_VOLUMES) {
      return std::nullopt;
    }
    SQLite::Statement& insert = Prepared("INSERT INTO Volumes(mountPoint) VALUES(?)");
    BindText(insert, 1, text);
    insert.exec();
    number = database_.getLastInsertRowid();
  }
  query.reset();
  volumes_.emplace(text, number);
  return number;
}

void SnapshotFile::AddFolder(const FolderRow& folder) {
  const auto volume = folder.isSound ? VolumeNumber(folder.volume) : std::nullopt;
  if (!volume) {
    ++state_.foldersLeftOut;
    return;
  }
  SQLite::Statement& insert = Prepared("INSERT INTO Folders VALUES(?, ?, ?, ?)");
  insert.bind(1, folder.id);
  insert.bind(2, folder.parent > 0 ? folder.parent : -1);
  BindText(insert, 3, folder.path);
  insert.bind(4, *volume);
  insert.exec();
  folderWords_.erase(folder.id);
  ++state_.folders;
}

bool SnapshotFile::Collect(const FileRow& file, PhotoBatch& batch) {
  const auto volume =
      file.isSound && WordsOf(file.folder).exists ? VolumeNumber(file.volume) : std::nullopt;
  if (volume) {
    const std::int64_t number = (file.id & 0x7FFF'FFFF) + state_.firstNumber;
    batch.Add(MakePhotoId(file.modified, number), file, *volume);
  } else {
    ++state_.filesLeftOut;
  }
  return volume.has_value();
}

void SnapshotFile::AddPhotos(const PhotoBatch& batch, bool index) {
  SQLite::Statement& insert = Prepared("INSERT OR IGNORE INTO Photos VALUES(?, ?, ?, ?)");
  SQLite::Statement& add = Prepared("INSERT INTO Search(rowid, words) VALUES(?, ?)");
  std::string name;
  for (const PhotoBatch::Row& row : batch.Rows()) {
    name = batch.Name(row);
    insert.reset();
    insert.bind(1, row.id);
    insert.bind(2, row.folder);
    insert.bind(3, row.volume);
    BindText(insert, 4, name);
    if (insert.exec() == 0) {
      ++state_.filesLeftOut; // only a crafted database has two rows with the same lower bits
      continue;
    }
    ++state_.photos;
    if (index) {
      ++state_.changes;
      add.reset();
      add.bind(1, row.id);
      BindText(add, 2, SearchText(row.folder, row.volume, name));
      add.exec();
    }
  }
}

const SnapshotFile::FolderWords& SnapshotFile::WordsOf(std::int64_t folder) {
  const auto found = folderWords_.find(folder);
  if (found != folderWords_.end()) {
    return found->second;
  }
  if (folderWordsSize_ > MOST_FOLDER_WORDS) {
    folderWords_.clear();
    folderWordsSize_ = 0;
  }
  SQLite::Statement& query =
      Prepared("SELECT f.path, v.mountPoint FROM Folders f JOIN Volumes v ON v.number = f.volume "
               "WHERE f.id = ?");
  query.bind(1, folder);
  FolderWords words;
  if (query.executeStep()) {
    words.exists = true;
    std::string plain;
    AppendWords(BelowVolume(query.getColumn(0).getString(), query.getColumn(1).getString()), plain);
    words.text = plain;
    frequent_.AppendMarks(plain, words.text);
    words.text += FolderMark(folder) + ' ';
  }
  query.reset();
  folderWordsSize_ += words.text.size() + 100;
  return folderWords_.emplace(folder, std::move(words)).first->second;
}

const std::string& SnapshotFile::SearchText(std::int64_t folder, std::int64_t volume,
                                            std::string_view name) {
  searchText_.clear();
  AppendWords(name, searchText_);
  const std::size_t size = searchText_.size();
  std::string marks;
  frequent_.AppendMarks(std::string_view(searchText_).substr(0, size), marks);
  searchText_ += marks;
  searchText_ += WordsOf(folder).text;
  searchText_ += VolumeMark(volume);
  return searchText_;
}

void SnapshotFile::SetFrequentPrefixes(const std::vector<std::string>& prefixes) {
  for (const std::string& prefix : prefixes) {
    SQLite::Statement& insert = Prepared("INSERT INTO Prefixes VALUES(?)");
    BindText(insert, 1, prefix);
    insert.exec();
  }
  frequent_ = FrequentPrefixes(prefixes);
  folderWords_.clear();
  folderWordsSize_ = 0;
}

void SnapshotFile::IndexAll(const std::function<void(std::int64_t done)>& progress) {
  constexpr std::int64_t interval = 1000;
  // In the order of the ids: FTS5 writes what it has collected when they do not ascend.
  SQLite::Statement query(database_, "SELECT id, folder, volume, name FROM Photos ORDER BY id");
  SQLite::Statement add(database_, "INSERT INTO Search(rowid, words) VALUES(?, ?)");
  for (std::int64_t done = 1; query.executeStep(); ++done) {
    const SQLite::Column name = query.getColumn(3);
    const std::string_view text(name.getText(), static_cast<std::size_t>(name.getBytes()));
    add.reset();
    add.bind(1, query.getColumn(0).getInt64());
    BindText(add, 2,
             SearchText(query.getColumn(1).getInt64(), query.getColumn(2).getInt64(), text));
    add.exec();
    if (done % interval == 0) {
      progress(done);
    }
  }
}

void SnapshotFile::ForEachPhoto(const std::function<void(std::int64_t)>& visit) {
  SQLite::Statement query(database_, "SELECT id FROM Photos ORDER BY id");
  while (query.executeStep()) {
    visit(query.getColumn(0).getInt64());
  }
}

void SnapshotFile::ForEachFolder(const std::function<void(std::int64_t)>& visit) {
  SQLite::Statement query(database_, "SELECT id FROM Folders ORDER BY id");
  while (query.executeStep()) {
    visit(query.getColumn(0).getInt64());
  }
}

void SnapshotFile::RemovePhotos(const std::vector<std::int64_t>& ids) {
  for (const std::int64_t id : ids) {
    SQLite::Statement& query = Prepared("SELECT folder, volume, name FROM Photos WHERE id = ?");
    query.bind(1, id);
    if (!query.executeStep()) {
      continue;
    }
    // FTS5 needs the text of the row that it is to delete.
    const std::string name = query.getColumn(2).getString();
    const std::string& text =
        SearchText(query.getColumn(0).getInt64(), query.getColumn(1).getInt64(), name);
    query.reset();
    SQLite::Statement& forget =
        Prepared("INSERT INTO Search(Search, rowid, words) VALUES('delete', ?, ?)");
    forget.bind(1, id);
    BindText(forget, 2, text);
    forget.exec();
    SQLite::Statement& remove = Prepared("DELETE FROM Photos WHERE id = ?");
    remove.bind(1, id);
    remove.exec();
    --state_.photos;
    ++state_.changes;
  }
}

void SnapshotFile::RemoveFolder(std::int64_t id) {
  std::vector<std::int64_t> photos;
  SQLite::Statement& inFolder = Prepared("SELECT rowid FROM Search WHERE Search MATCH ?");
  inFolder.bind(1, '"' + FolderMark(id) + '"');
  while (inFolder.executeStep()) {
    photos.push_back(inFolder.getColumn(0).getInt64());
  }
  inFolder.reset();
  RemovePhotos(photos);
  SQLite::Statement& remove = Prepared("DELETE FROM Folders WHERE id = ?");
  remove.bind(1, id);
  remove.exec();
  folderWords_.erase(id);
  --state_.folders;
}

std::int64_t SnapshotFile::NearestFolder(std::string_view path) {
  for (int level = 0; level < MOST_LEVELS; ++level) {
    const std::size_t end =
        path.size() < 2 ? std::string_view::npos : path.rfind('/', path.size() - 2);
    if (end == std::string_view::npos) {
      break;
    }
    path = path.substr(0, end + 1);
    const std::string text(path);
    SQLite::Statement& query = Prepared("SELECT id FROM Folders WHERE path = ? LIMIT 1");
    BindText(query, 1, text);
    const bool isFound = query.executeStep();
    const std::int64_t id = isFound ? query.getColumn(0).getInt64() : -1;
    query.reset();
    if (isFound) {
      return id;
    }
  }
  return -1;
}

void SnapshotFile::AdoptFolders() {
  std::vector<std::pair<std::int64_t, std::string>> orphans;
  {
    SQLite::Statement query(database_, "SELECT id, path FROM Folders f WHERE parent != -1 AND NOT "
                                       "EXISTS (SELECT 1 FROM Folders p WHERE p.id = f.parent)");
    while (query.executeStep()) {
      orphans.emplace_back(query.getColumn(0).getInt64(), query.getColumn(1).getString());
    }
  }
  for (const auto& [id, path] : orphans) {
    const std::int64_t parent = NearestFolder(path);
    SQLite::Statement& update = Prepared("UPDATE Folders SET parent = ? WHERE id = ?");
    update.bind(1, parent);
    update.bind(2, id);
    update.exec();
  }
}

bool SnapshotFile::HasRows(std::int64_t volume) {
  SQLite::Statement& folders = Prepared("SELECT 1 FROM Folders WHERE volume = ? LIMIT 1");
  folders.bind(1, volume);
  const bool hasFolders = folders.executeStep();
  folders.reset();
  if (hasFolders) {
    return true;
  }
  SQLite::Statement& photos = Prepared("SELECT 1 FROM Search WHERE Search MATCH ? LIMIT 1");
  photos.bind(1, '"' + VolumeMark(volume) + '"');
  const bool hasPhotos = photos.executeStep();
  photos.reset();
  return hasPhotos;
}

bool SnapshotFile::ReplaceStatistics(const Statistics& statistics) {
  using Values = std::array<std::int64_t, 4>;
  std::map<std::string, Values> wanted;
  for (const auto& [mountPoint, row] : statistics) {
    SQLite::Statement& query = Prepared("SELECT number FROM Volumes WHERE mountPoint = ?");
    BindText(query, 1, mountPoint);
    const bool isKnown = query.executeStep();
    const std::int64_t number = isKnown ? query.getColumn(0).getInt64() : 0;
    query.reset();
    const bool isGone = row.mergedUpTo == 0 && !(isKnown && HasRows(number));
    wanted[mountPoint] = {row.transcoded, row.total, row.mergedUpTo, isGone ? 1 : 0};
  }
  std::map<std::string, Values> present;
  SQLite::Statement query(database_, "SELECT * FROM Statistics");
  while (query.executeStep()) {
    Values& values = present[query.getColumn(0).getString()];
    for (std::size_t i = 0; i < values.size(); ++i) {
      values.at(i) = query.getColumn(static_cast<int>(i) + 1).getInt64();
    }
  }
  if (present == wanted) {
    return false;
  }
  database_.exec("DELETE FROM Statistics");
  for (const auto& [mountPoint, values] : wanted) {
    SQLite::Statement& insert = Prepared("INSERT INTO Statistics VALUES(?, ?, ?, ?, ?)");
    BindText(insert, 1, mountPoint);
    for (std::size_t i = 0; i < values.size(); ++i) {
      insert.bind(static_cast<int>(i) + 2, values.at(i));
    }
    insert.exec();
  }
  return true;
}

void SnapshotFile::Complete() {
  database_.exec("UPDATE State SET isComplete = 1");
  database_.exec("INSERT INTO Search(Search, rank) VALUES('automerge', 8)");
  database_.exec("PRAGMA journal_mode = WAL");
}

bool SnapshotFile::Tidy() {
  const int before = database_.getTotalChanges();
  SQLite::Statement& merge = Prepared("INSERT INTO Search(Search, rank) VALUES('merge', ?)");
  merge.bind(1, PAGES_TO_TIDY);
  merge.exec();
  // A step without any work changes less than two rows.
  return database_.getTotalChanges() - before >= 2;
}

} // namespace orva::web
