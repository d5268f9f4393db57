#include "Snapshot.h"

#include "CacheDirectory.h"
#include "MergedSource.h"
#include "SnapshotFile.h"

#include "zophotos/Failure.h"
#include "zophotos/MergedDatabase.h"
#include "zophotos/Text.h"

#include <SQLiteCpp/Exception.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstddef>
#include <filesystem>
#include <fstream>
#include <future>
#include <iostream>
#include <mutex>
#include <optional>
#include <stdexcept>
#include <thread>
#include <utility>
#include <vector>

namespace orva::web {

namespace {

using Clock = std::chrono::steady_clock;
using State = SnapshotStatus::State;

/// A merge locks the database for less than this. After it, the status says that it is locked.
constexpr std::chrono::seconds LONGEST_LOCK(5);

/// Bytes of photos to sort in memory while a snapshot is built.
constexpr std::size_t LARGEST_BATCH = 16 << 20;

/// Photos that one update changes at most. To build the snapshot again is faster than to make more
/// changes.
std::int64_t MostChanges(std::int64_t photos) {
  return std::max<std::int64_t>(20'000, photos / 8);
}

/// Photos changed by any number of updates, after which a snapshot is renewed. The new search index
/// knows the prefixes that are frequent now.
std::int64_t ChangesToRenew(std::int64_t photos) {
  return std::max<std::int64_t>(20'000, photos / 32);
}

/// After a renewal that failed, or without space for one; later pauses are twice as long.
constexpr std::chrono::seconds SHORTEST_RENEWAL_PAUSE(60);
constexpr std::chrono::seconds LONGEST_RENEWAL_PAUSE(3600);

/// Ends an update because the caller wants it to stop.
struct Stopped {};

void StopIfAsked(const std::stop_token& stop) {
  if (stop.stop_requested()) {
    throw Stopped();
  }
}

/// Identifies the present start of the system. After another one, a snapshot may be damaged: it is
/// written without waiting for the disk. Empty if unknown.
std::string BootId() {
  std::string id;
  std::getline(std::ifstream("/proc/sys/kernel/random/boot_id"), id);
  return id;
}

/// Milliseconds since the epoch.
std::int64_t Now() {
  using namespace std::chrono;
  return duration_cast<milliseconds>(system_clock::now().time_since_epoch()).count();
}

void Log(const std::string& line) {
  std::cerr << "zophotos-web: " + zophotos::Printable(line) + '\n';
}

} // namespace

const char* NameOf(State state) {
  switch (state) {
  case State::NoDatabase:
    return "no_database";
  case State::Building:
    return "building";
  case State::Current:
    return "current";
  case State::Failed:
    break;
  }
  return "failed";
}

/// Finds what is missing among the ids of the merged database.
template <typename Id>
class Missing {
public:
  explicit Missing(std::vector<Id> ids) : ids_(std::move(ids)) {
    if (!std::ranges::is_sorted(ids_)) {
      std::ranges::sort(ids_);
    }
  }

  /// Looks for the row with the id `row` of the photo or folder `id`.
  void Check(std::int64_t id, std::int64_t row) {
    if (!std::ranges::binary_search(ids_, static_cast<Id>(row))) {
      missing_.push_back(id);
    }
  }

  const std::vector<std::int64_t>& Ids() const noexcept { return missing_; }

private:
  std::vector<Id> ids_;
  std::vector<std::int64_t> missing_;
};

/// A snapshot that a thread makes while the present one is read and updated. Abandoned when
/// destroyed.
class Renewal {
public:
  using Make = std::packaged_task<SnapshotFile(const std::stop_token&)>;

  explicit Renewal(Make make) : made_(make.get_future()), thread_(std::move(make)) {}

  bool IsReady() const {
    return made_.wait_for(std::chrono::seconds(0)) == std::future_status::ready;
  }

  /// Waits for the snapshot. Throws what making it has thrown.
  SnapshotFile Take() { return made_.get(); }

private:
  std::future<SnapshotFile> made_;
  std::jthread thread_;
};

class Snapshot::Implementation {
public:
  Implementation(const std::string& directory, FindPath findPath)
      : directory_(directory), findPath_(std::move(findPath)), boot_(BootId()) {
    std::vector<std::uint64_t> numbers = directory_.Numbers();
    for (; !numbers.empty() && !file_; numbers.pop_back()) {
      number_ = std::max(number_, numbers.back());
      if (TryOpen(numbers.back())) {
        number_ = numbers.back();
      }
    }
    if (file_) {
      directory_.RemoveOthers(number_);
    } else {
      PublishEmpty();
    }
  }

  bool Update(const std::stop_token& stop, const std::function<void()>& tellBuild) {
    const std::int64_t before = file_->State().version;
    if (damaged_.exchange(false)) {
      Log("the snapshot " + File() + " is damaged; building it again");
      mustBuild_ = true;
    }
    try {
      UpdateFrom(FindDatabase(), stop, tellBuild);
    } catch (const Stopped&) {
      Discard();
    } catch (const zophotos::Failure& failure) {
      Discard();
      Fail(failure);
    } catch (const SQLite::Exception& error) {
      Discard();
      mustBuild_ = mustBuild_ || zophotos::IsDamage(error);
      FailLater(std::string("cannot write the snapshot: ") + error.what());
    }
    return file_->State().version != before;
  }

  SnapshotStatus Status() const {
    const std::lock_guard lock(mutex_);
    return status_;
  }

  std::string File() const {
    const std::lock_guard lock(mutex_);
    return path_;
  }

  void ReportDamage() { damaged_ = true; }

private:
  bool TryOpen(std::uint64_t number) {
    auto file = SnapshotFile::Open(directory_.File(number));
    if (!file || boot_.empty() || file->State().boot != boot_) {
      return false;
    }
    file_.emplace(std::move(*file));
    path_ = file_->Path();
    return true;
  }

  void SetStatus(State state, const std::string& reason = {}) {
    const std::lock_guard lock(mutex_);
    status_ = {.state = state, .done = 0, .total = 0, .reason = reason};
  }

  /// Undoes an update that did not end.
  void Discard() {
    try {
      file_->Rollback();
    } catch (const SQLite::Exception&) {
      mustBuild_ = true;
    }
    if (!renewal_) {
      directory_.RemoveOthers(number_);
    }
  }

  /// An error here is no reason for a pause.
  std::string FindDatabase() {
    try {
      return findPath_();
    } catch (const zophotos::Failure&) {
      pause_ = {};
      throw;
    }
  }

  void Fail(const zophotos::Failure& failure) {
    if (failure.Status() != zophotos::ExitStatus::Locked) {
      lockedSince_.reset();
    }
    if (failure.Status() == zophotos::ExitStatus::NoDatabase) {
      if (mustBuild_ || !IsEmpty()) {
        PublishEmpty();
        mustBuild_ = false;
      }
      SetStatus(State::NoDatabase, failure.what());
    } else if (failure.Status() != zophotos::ExitStatus::Locked) {
      FailLater(failure.what());
    } else if (!lockedSince_) {
      lockedSince_ = Clock::now();
    } else if (Clock::now() - *lockedSince_ > LONGEST_LOCK) {
      SetStatus(State::Failed, failure.what());
    }
  }

  void FailLater(const std::string& reason) {
    constexpr std::chrono::seconds longest(60);
    pause_ = std::clamp<std::chrono::seconds>(pause_ * 2, std::chrono::seconds(1), longest);
    nextTry_ = Clock::now() + pause_;
    SetStatus(State::Failed, reason);
  }

  void Succeed() {
    pause_ = {};
    nextTry_ = {};
    lockedSince_.reset();
    SetStatus(State::Current);
  }

  void UpdateFrom(const std::string& path, const std::stop_token& stop,
                  const std::function<void()>& tellBuild) {
    const auto identity = Identify(path);
    if (identity == failed_ && Clock::now() < nextTry_) {
      return;
    }
    failed_ = identity;
    const bool isRenewed = renewal_ && renewal_->IsReady();
    if (IsCurrent(identity) && !isRenewed) {
      isTidy_ = isTidy_ || !file_->Tidy();
    } else {
      isTidy_ = false;
      MergedSource source(path);
      if (isRenewed && identity) {
        AdoptRenewal(source, *identity, stop);
      }
      if (!IsCurrent(identity)) {
        FollowOrBuild(source, identity, stop, tellBuild);
      }
    }
    Succeed();
    if (!renewal_ && file_->State().changes > ChangesToRenew(file_->State().photos) &&
        Clock::now() >= renewAt_) {
      if (HasSpaceForRenewal()) {
        StartRenewal(path);
      } else {
        RenewLater();
      }
    }
  }

  bool IsCurrent(const std::optional<SourceIdentity>& identity) {
    return !mustBuild_ && identity && *identity == file_->State().source;
  }

  void FollowOrBuild(MergedSource& source, const std::optional<SourceIdentity>& identity,
                     const std::stop_token& stop, const std::function<void()>& tellBuild) {
    const bool isOther = !identity || identity->file != file_->State().source.file;
    if (mustBuild_ || isOther || !Continue(*file_, source, *identity, stop)) {
      SetStatus(State::Building);
      if (tellBuild) {
        tellBuild();
      }
      Build(source, identity.value_or(SourceIdentity()), stop);
    }
  }

  /// Adds what is new in the merged database and removes what it does not have any more. Its rows
  /// never change, and ids are never used twice. Returns whether that was possible.
  static bool Continue(SnapshotFile& file, MergedSource& source, const SourceIdentity& identity,
                       const std::stop_token& stop) {
    SnapshotState& state = file.State();
    const std::int64_t version = source.DataVersion();
    const std::int64_t changesBefore = state.changes;
    const std::int64_t mostChanges = changesBefore + MostChanges(state.photos);
    file.Begin();
    bool hasChanged = false;
    MergedRows rows;
    PhotoBatch batch;
    for (bool more = true; more;) {
      StopIfAsked(stop);
      rows.Clear();
      more = source.ReadMore(state.position, rows);
      hasChanged = hasChanged || !rows.folders.empty();
      AddRows(file, rows, batch, nullptr);
      batch.Sort();
      file.AddPhotos(batch, true);
      batch.Clear();
      if (state.changes > mostChanges) {
        file.Rollback();
        return false;
      }
    }
    const std::int64_t folders = state.folders;
    const auto left = RemoveMissing(file, source, mostChanges, stop);
    const Statistics statistics = ReadStatistics(source, [&] { StopIfAsked(stop); });
    const MergedSource::State sourceState = source.ReadState();
    if (!left || sourceState.lastFile < state.position.file) {
      file.Rollback();
      return false;
    }
    hasChanged = hasChanged || state.folders != folders;
    if (hasChanged) {
      file.AdoptFolders();
    }
    hasChanged = file.ReplaceStatistics(statistics) || hasChanged || state.changes != changesBefore;
    SetSource(state, identity, sourceState, version);
    if (sourceState.dataVersion == version) {
      state.filesLeftOut = left->files - state.photos;
      state.foldersLeftOut = left->folders - state.folders;
    }
    if (hasChanged) {
      state.version = std::max(state.version + 1, Now());
    }
    file.Commit();
    return true;
  }

  /// Rows of the merged database.
  struct RowCounts {
    std::int64_t files = 0;
    std::int64_t folders = 0;
  };

  /// Removes what the merged database does not have any more, and returns how many rows it has;
  /// nothing if there is too much to remove. Everything new has been added, so equal counts mean
  /// that nothing is missing.
  static std::optional<RowCounts> RemoveMissing(SnapshotFile& file, MergedSource& source,
                                                std::int64_t mostChanges,
                                                const std::stop_token& stop) {
    const SnapshotState& state = file.State();
    RowCounts left;
    {
      std::vector<std::uint32_t> ids;
      ids.reserve(static_cast<std::size_t>(std::max<std::int64_t>(state.photos, 0)));
      for (std::int64_t after = 0; source.ReadFileIds(after, ids);) {
        StopIfAsked(stop);
      }
      left.files = std::ssize(ids);
      if (left.files != state.photos + state.filesLeftOut) {
        Missing<std::uint32_t> missing(std::move(ids));
        file.ForEachPhoto(
            [&](std::int64_t id) { missing.Check(id, RowOf(id, state.firstNumber)); });
        if (state.changes + std::ssize(missing.Ids()) > mostChanges) {
          return std::nullopt;
        }
        file.RemovePhotos(missing.Ids());
      }
    }
    std::vector<std::int64_t> ids;
    for (std::int64_t after = 0; source.ReadFolderIds(after, ids);) {
      StopIfAsked(stop);
    }
    left.folders = std::ssize(ids);
    if (left.folders != state.folders + state.foldersLeftOut) {
      Missing<std::int64_t> missing(std::move(ids));
      file.ForEachFolder([&](std::int64_t id) { missing.Check(id, id); });
      for (const std::int64_t id : missing.Ids()) {
        StopIfAsked(stop);
        file.RemoveFolder(id);
      }
    }
    return left;
  }

  static Statistics ReadStatistics(MergedSource& source, const std::function<void()>& pulse) {
    Statistics statistics;
    for (std::int64_t after = 0; source.ReadStatistics(after, statistics);) {
      pulse();
    }
    return statistics;
  }

  /// Makes a new snapshot next to the present one and replaces that.
  void Build(MergedSource& source, const SourceIdentity& identity, const std::stop_token& stop) {
    SnapshotFile file = CreateNext();
    Fill(file, source, identity, [&](std::int64_t done, std::int64_t total) {
      StopIfAsked(stop);
      const std::lock_guard lock(mutex_);
      status_.done = done;
      status_.total = total;
    });
    const SnapshotState& state = file.State();
    if (state.filesLeftOut != 0 || state.foldersLeftOut != 0) {
      Log("left out " + zophotos::Count(state.filesLeftOut, "file") + " and " +
          zophotos::Count(state.foldersLeftOut, "folder") +
          " that the daemon cannot have merged: " + source.Path());
    }
    Publish(std::move(file));
    mustBuild_ = false;
  }

  /// Called often while a snapshot is filled. What it throws ends that.
  using Progress = std::function<void(std::int64_t done, std::int64_t total)>;

  /// Fills a new snapshot in a transaction that it begins.
  static void Fill(SnapshotFile& file, MergedSource& source, const SourceIdentity& identity,
                   const Progress& progress) {
    SnapshotState& state = file.State();
    state.firstNumber = FirstNumber(identity);
    const std::int64_t version = source.DataVersion();
    const std::int64_t total = source.EstimateFiles();
    const auto show = [&](std::int64_t done) { progress(std::min(done / 2, total), total); };
    file.Begin();
    PrefixSample sample(total);
    CopyRows(source, file, sample, show);
    file.SetFrequentPrefixes(sample.Frequent());
    file.AdoptFolders();
    file.IndexAll([&](std::int64_t done) { show(state.photos + done); });
    file.ReplaceStatistics(ReadStatistics(source, [&] { show(2 * total); }));
    SetSource(state, identity, source.ReadState(), version);
  }

  static void CopyRows(MergedSource& source, SnapshotFile& file, PrefixSample& sample,
                       const std::function<void(std::int64_t)>& show) {
    MergedRows rows;
    PhotoBatch batch;
    const auto flush = [&] {
      batch.Sort();
      file.AddPhotos(batch, false);
      batch.Clear();
    };
    std::int64_t done = 0;
    for (bool more = true; more;) {
      rows.Clear();
      more = source.ReadMore(file.State().position, rows);
      AddRows(file, rows, batch, &sample);
      if (batch.Bytes() > LARGEST_BATCH) {
        flush();
      }
      done += static_cast<std::int64_t>(rows.Files());
      show(done);
    }
    flush();
  }

  static void AddRows(SnapshotFile& file, const MergedRows& rows, PhotoBatch& batch,
                      PrefixSample* sample) {
    for (const FolderRow& folder : rows.folders) {
      file.AddFolder(folder);
    }
    for (std::size_t i = 0; i < rows.Files(); ++i) {
      const FileRow row = rows.File(i);
      if (file.Collect(row, batch) && sample != nullptr && sample->Next()) {
        sample->Add(file.SearchText(row.folder, 0, row.name));
      }
    }
  }

  /// Remembers what the snapshot agrees with, if nothing was changed while it was read.
  static void SetSource(SnapshotState& state, const SourceIdentity& identity,
                        const MergedSource::State& sourceState, std::int64_t version) {
    // Otherwise another file may have come to this path before it was opened.
    const bool isSameFile = sourceState.identity && sourceState.identity->file == identity.file;
    state.source = isSameFile ? identity : SourceIdentity();
    state.source.content = isSameFile && sourceState.dataVersion == version
                               ? sourceState.identity->content
                               : std::string();
  }

  bool IsEmpty() { return file_->State().source.file.empty() && file_->State().folders == 0; }

  void PublishEmpty() {
    SnapshotFile file = CreateNext();
    file.Begin();
    Publish(std::move(file));
  }

  SnapshotFile CreateNext() {
    EndRenewal();
    nextNumber_ = directory_.FreeNumber(number_);
    return SnapshotFile::Create(directory_.File(nextNumber_));
  }

  /// The thread leaves the boot's identity out, so that a file that was not adopted is not used.
  void StartRenewal(const std::string& path) {
    EndRenewal();
    nextNumber_ = directory_.FreeNumber(number_);
    renewal_.emplace(
        Renewal::Make([path, next = directory_.File(nextNumber_)](const std::stop_token& stop) {
          const auto identity = Identify(path);
          MergedSource source(path);
          SnapshotFile file = SnapshotFile::Create(next);
          Fill(file, source, identity.value_or(SourceIdentity()),
               [&stop](std::int64_t, std::int64_t) { StopIfAsked(stop); });
          file.Commit();
          file.Complete();
          return file;
        }));
  }

  /// Space for as much as the present file has, and as much again: the present one is changed
  /// meanwhile, and other programs need some.
  bool HasSpaceForRenewal() {
    std::error_code error;
    const auto available = std::filesystem::space(file_->Path(), error).available;
    return !error && available / 2 > static_cast<std::uintmax_t>(file_->Bytes());
  }

  void RenewLater() {
    renewalPause_ = std::clamp(renewalPause_ * 2, SHORTEST_RENEWAL_PAUSE, LONGEST_RENEWAL_PAUSE);
    renewAt_ = Clock::now() + renewalPause_;
  }

  void EndRenewal() {
    renewal_.reset();
    directory_.RemoveOthers(number_);
  }

  /// Makes the renewed snapshot the present one, with what has changed meanwhile. If it cannot be
  /// used, the present one stays.
  void AdoptRenewal(MergedSource& source, const SourceIdentity& identity,
                    const std::stop_token& stop) {
    try {
      SnapshotFile file = std::exchange(renewal_, std::nullopt)->Take();
      if (file.State().source.file == identity.file && Continue(file, source, identity, stop)) {
        file.Begin();
        Publish(std::move(file));
        renewalPause_ = {};
        return;
      }
    } catch (const std::runtime_error& error) { // of the merged database or the snapshot
      Log(std::string("cannot renew the snapshot: ") + error.what());
    }
    RenewLater();
    directory_.RemoveOthers(number_);
  }

  /// Ends the transaction of a snapshot with the number nextNumber_, and makes it the present one.
  void Publish(SnapshotFile file) {
    const std::int64_t former = file_ ? file_->State().version : 0;
    file.State().version = std::max(former + 1, Now());
    file.State().boot = boot_;
    file.Commit();
    file.Complete();
    file_.reset();
    file_.emplace(std::move(file));
    number_ = nextNumber_;
    {
      const std::lock_guard lock(mutex_);
      path_ = file_->Path();
    }
    directory_.RemoveOthers(number_);
  }

  CacheDirectory directory_;
  const FindPath findPath_;
  const std::string boot_;
  std::uint64_t number_ = 0;     ///< of the present file
  std::uint64_t nextNumber_ = 0; ///< of the file that is made next, or by the renewal
  std::optional<SnapshotFile> file_;
  std::optional<Renewal> renewal_;
  Clock::time_point renewAt_; ///< not earlier
  std::chrono::seconds renewalPause_{};
  bool mustBuild_ = false;
  bool isTidy_ = false; ///< the search index, since the last change

  std::optional<SourceIdentity> failed_; ///< what the last try was for
  std::chrono::seconds pause_{};
  Clock::time_point nextTry_;
  std::optional<Clock::time_point> lockedSince_;

  mutable std::mutex mutex_;
  SnapshotStatus status_;
  std::string path_;
  std::atomic<bool> damaged_ = false;
};

Snapshot::Snapshot(const std::string& directory, FindPath findPath)
    : implementation_(std::make_unique<Implementation>(directory, std::move(findPath))) {}

Snapshot::~Snapshot() = default;

bool Snapshot::Update(const std::stop_token& stop, const std::function<void()>& tellBuild) {
  return implementation_->Update(stop, tellBuild);
}

SnapshotStatus Snapshot::Status() const {
  return implementation_->Status();
}

std::string Snapshot::File() const {
  return implementation_->File();
}

void Snapshot::ReportDamage() const {
  implementation_->ReportDamage();
}

} // namespace orva::web
