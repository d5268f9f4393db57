#include "Commands.h"
#include "ExportState.h"
#include "MergedDatabase.h"
#include "PhotoLines.h"

#include <SQLiteCpp/Statement.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <memory>
#include <string_view>
#include <system_error>

namespace orva::zophotos {

namespace {

/// A hash that stays the same in later versions (FNV-1a).
std::uint64_t Hash(std::string_view text) {
  std::uint64_t hash = 0xcbf29ce484222325U;
  for (const char byte : text) {
    hash = (hash ^ static_cast<unsigned char>(byte)) * 0x100000001b3U;
  }
  return hash;
}

/// A hash of the path of a file, its inode, and when the inode was made, as far as the file system
/// knows it: numbers of inodes are used again. 0 if the file is missing.
std::uint64_t HashFile(const std::string& path) {
  const std::unique_ptr<char, decltype(&std::free)> real(realpath(path.c_str(), nullptr),
                                                         &std::free);
  struct statx status {};
  if (!real || statx(AT_FDCWD, path.c_str(), 0, STATX_INO | STATX_BTIME, &status) != 0) {
    return 0;
  }
  return Hash(std::string(real.get()) + '\n' + std::to_string(status.stx_ino) + '\n' +
              std::to_string(status.stx_btime.tv_sec) + '\n' +
              std::to_string(status.stx_btime.tv_nsec));
}

std::int64_t ReadNumber(SQLite::Database& database, const char* sql) {
  SQLite::Statement query(database, sql);
  return query.executeStep() ? query.getColumn(0).getInt64() : 0;
}

/// `file` is the result of HashFile.
DatabaseIdentity Identify(SQLite::Database& copy, std::uint64_t file) {
  DatabaseIdentity identity{.file = file};
  identity.emptied = ReadNumber(copy, "SELECT mdate FROM Status WHERE id = 1");
  if (copy.tableExists("sqlite_sequence")) {
    identity.lastId = ReadNumber(copy, "SELECT seq FROM sqlite_sequence WHERE name = 'Files'");
  }
  return identity;
}

bool IsSame(const DatabaseIdentity& before, const DatabaseIdentity& now) {
  return now.file != 0 && now.file == before.file && now.emptied == before.emptied &&
         now.lastId >= before.lastId;
}

FeedId NewId() {
  FeedId id{};
  if (getentropy(id.data(), id.size()) != 0) {
    throw std::system_error(errno, std::generic_category(), "getentropy");
  }
  return id;
}

std::string ToText(const FeedId& id) {
  std::string text;
  for (const char byte : id) {
    std::array<char, 3> digits{};
    std::snprintf(digits.data(), digits.size(), "%02x", static_cast<unsigned char>(byte));
    text += digits.data();
  }
  return text;
}

/// Whether the pending feed is the one that comes after the delivered one.
bool Follows(const PhotoListReader& pending, const std::optional<PhotoListReader>& delivered) {
  return pending.Header().previous == (delivered ? delivered->Header().id : FeedId());
}

/// Makes a feed of the database at `path` that is pending afterwards. `obsolete` was pending
/// before.
void MakeFeed(const ExportState& state, const std::optional<PhotoListReader>& delivered,
              const std::optional<PhotoListReader>& obsolete, const std::string& path, bool whole) {
  Feed feed{.id = NewId(), .time = std::time(nullptr)};
  const std::uint64_t file = HashFile(path);
  SQLite::Database copy = CopyDatabase(path);
  // The file may have been replaced meanwhile. 0 is never taken for the same database.
  feed.database = Identify(copy, HashFile(path) == file ? file : 0);
  if (delivered) {
    const Feed& last = delivered->Header();
    feed.number = last.number;
    feed.previous = last.id;
    feed.isWhole = whole || !last.hasPhotos || !IsSame(last.database, feed.database);
  }
  if (obsolete) {
    // It may have been printed.
    feed.number = std::max(feed.number, obsolete->Header().number);
  }
  ++feed.number;
  try {
    PhotoListWriter list = state.WritePending(feed);
    WalkPhotos(copy, [&list](const Photo& photo) { list.Add(photo); });
    list.Finish();
  } catch (...) {
    state.RemovePending();
    throw;
  }
  state.Synchronise();
}

/// Calls `visit` for each photo that is only in one of the lists, in the order of their paths, with
/// -1 for `before` and 1 for `now`. Of the photos with the same path, those of `before` come first.
void Compare(PhotoListReader* before, PhotoListReader& now,
             const std::function<void(int, const Photo&)>& visit) {
  const Photo* gone = before == nullptr ? nullptr : before->Next();
  const Photo* added = now.Next();
  while (gone != nullptr || added != nullptr) {
    const bool isGone = gone != nullptr && (added == nullptr || gone->path <= added->path);
    const bool isSame = isGone && added != nullptr && *gone == *added;
    if (!isSame) {
      visit(isGone ? -1 : 1, isGone ? *gone : *added);
    }
    if (isSame || !isGone) {
      added = now.Next();
    }
    if (isGone) {
      gone = before->Next();
    }
  }
}

void PrintBegin(const Feed& feed, ExportFormat format) {
  const std::string previous = feed.isWhole ? "" : ToText(feed.previous);
  if (format == ExportFormat::Csv) {
    std::cout << "feed," << feed.number << ',' << ToText(feed.id) << ',' << previous << ','
              << (feed.isWhole ? "whole" : "changes") << ',' << IsoTime(feed.time).value_or("")
              << "\nsign," << CSV_HEADINGS << '\n';
  } else {
    PrintLine({{"feed", ToText(feed.id)},
               {"number", feed.number},
               {"previous", feed.isWhole ? Json() : Json(previous)},
               {"whole", feed.isWhole},
               {"time", JsonTime(feed.time)}});
  }
}

void PrintEnd(const Feed& feed, std::uint64_t rows, std::uint64_t photos, ExportFormat format) {
  if (format == ExportFormat::Csv) {
    std::cout << "end," << feed.number << ',' << ToText(feed.id) << ',' << rows << ',' << photos
              << '\n';
  } else {
    PrintLine(
        {{"end", ToText(feed.id)}, {"number", feed.number}, {"rows", rows}, {"photos", photos}});
  }
}

void PrintFeed(PhotoListReader* delivered, PhotoListReader& pending, ExportFormat format,
               bool escapes) {
  const Feed& feed = pending.Header();
  PrintBegin(feed, format);
  std::uint64_t rows = 0;
  Compare(feed.isWhole ? nullptr : delivered, pending, [&](int sign, const Photo& photo) {
    ++rows;
    if (format == ExportFormat::Csv) {
      std::cout << sign << ',' << CsvFields(photo, escapes) << '\n';
    } else {
      Json line{{"sign", sign}};
      AddMembers(line, photo);
      PrintLine(line);
    }
  });
  PrintEnd(feed, rows, pending.Photos(), format);
}

[[noreturn]] void ThrowOutputError() {
  throw Failure(ExitStatus::Failed, "cannot write to standard output");
}

/// Waits until the disk has standard output, if that is a file.
void SynchroniseOutput() {
  struct stat status {};
  if (fstat(STDOUT_FILENO, &status) != 0 ||
      (S_ISREG(status.st_mode) && fsync(STDOUT_FILENO) != 0)) {
    ThrowOutputError();
  }
}

} // namespace

ExitStatus ExportChanges(const std::string& path, const Changes& changes, ExportFormat format,
                         bool escapes) {
  if (fcntl(STDOUT_FILENO, F_GETFD) == -1) {
    ThrowOutputError(); // a file that is opened now would become standard output
  }
  const ExportState state(changes.state);
  auto delivered = state.Delivered();
  auto pending = state.Pending();
  // A pending feed is printed again as it is. Made again from the database, it could differ from
  // what a killed export has printed.
  if (changes.whole || !pending || !Follows(*pending, delivered)) {
    MakeFeed(state, delivered, pending, path, changes.whole);
    pending = state.Pending();
  }
  if (!pending || !Follows(*pending, delivered)) {
    throw Failure(ExitStatus::Failed, changes.state + ".next was changed by another program");
  }
  PrintFeed(delivered ? &*delivered : nullptr, *pending, format, escapes);
  if (!std::cout.flush()) {
    return ExitStatus::Failed; // reported when the program ends
  }
  SynchroniseOutput();
  state.Deliver(*pending);
  return ExitStatus::Success;
}

} // namespace orva::zophotos
