#include "Measurements.h"

#include "CatalogChanges.h"
#include "Fingerprint.h"
#include "MeasuredDaemon.h"
#include "Yardsticks.h"

#include "CatalogSchema.h"
#include "Generator.h"

#include "orvadb/Statement.h"
#include "orvadb/VolumeDB.h"
#include "orvautil/Core.h"

#include <chrono>
#include <filesystem>
#include <iostream>
#include <optional>
#include <stdexcept>

namespace orva::bench {

namespace {

using catalog::Names;
using Output = MeasuredDaemon::Output;

constexpr int BATCH_SIZE = 100;
constexpr int ADDITIONS = 100;
/// The reader's statements run once for this many additions, and their time counts as often.
constexpr int ADDITIONS_PER_SHELL = 10;
/// The floor has no target, so it runs in the first pairs only.
constexpr std::size_t FLOOR_PAIRS = 2;

/// The sizes of a shape whose sizes are fixed; empty for the others.
std::vector<long long> FixedSizes(const std::string& shape) {
  if (shape == "folders") {
    return {100'000};
  }
  if (shape == "same-names") {
    return {200'000};
  }
  if (shape == "covers") {
    return {10'000, 100'000};
  }
  return {};
}

catalog::GeneratorPlan PlanOf(const std::string& shape, long long files) {
  using catalog::Tree;
  if (shape == "unique") {
    return {.files = files, .perFolder = 100};
  }
  if (shape == "flat") {
    return {.files = files, .perFolder = files};
  }
  if (shape == "deep") {
    return {.files = files, .perFolder = 20, .tree = Tree::Deep};
  }
  if (shape == "folders" || shape == "covers") {
    return {.files = files, .perFolder = 1};
  }
  if (shape == "same-names") {
    return {.files = files, .perFolder = BATCH_SIZE, .names = Names::Camera};
  }
  return {.files = files, .perFolder = 1000, .names = Names::Camera}; // camera, restamped
}

/// Copies a database that no program has open.
void CopyDatabase(const std::string& from, const std::string& to) {
  std::filesystem::copy_file(from, to, std::filesystem::copy_options::overwrite_existing);
}

/// The measurements of one catalog, from the first merge of its files to their deletion.
class Case {
public:
  Case(const Options& options, Results& results, std::string shape, long long files)
      : options_(options), results_(results), shape_(std::move(shape)), files_(files),
        present_(files) {}

  void Run() {
    Generate();
    if (FixedSizes(shape_).empty() && shape_ != "restamped") {
      if (FirstMerges()) {
        MeasureChanges();
      }
      return;
    }
    if (!MergeOnce()) {
      return;
    }
    if (shape_ == "restamped") {
      if (MergesAgain()) {
        MeasureChanges();
      }
    } else if (shape_ == "covers") {
      Covers();
    } else if (shape_ == "same-names") {
      MeasuredDaemon daemon(master_, library_);
      Batches(daemon, BATCH_OF_KNOWN_NAMES, Names::Camera);
    } else { // folders
      MeasuredDaemon daemon(master_, library_);
      UnchangedMerges(daemon);
    }
  }

private:
  void Generate() const {
    Report("generating");
    const auto database = catalog::OpenCatalog(library_.Path());
    catalog::Generate(*database, PlanOf(shape_, files_), std::time(nullptr));
    catalog::Checkpoint(*database);
  }

  /// Merges the whole catalog, not measured.
  bool MergeOnce() {
    Report("merging");
    MeasuredDaemon daemon(master_, library_);
    if (daemon.Merge(options_.limit)) {
      return true;
    }
    Add(FIRST_MERGE).gaveUp = true;
    return false;
  }

  /// What follows the merges of all files.
  void MeasureChanges() {
    {
      MeasuredDaemon daemon(master_, library_);
      if (!UnchangedMerges(daemon) || !Batches(daemon, BATCH_OF_100, Names::Unique) ||
          (shape_ == "flat" && !SingleAdditions(daemon))) {
        return;
      }
    }
    Deletions();
  }

  /// Merges the whole catalog into a new database, each time with a new daemon.
  bool FirstMerges() {
    Measurement memory = NewMeasurement(PEAK_MEMORY);
    Measurement merge = NewMeasurement(FIRST_MERGE);
    Measurement intoFile = NewMeasurement(FIRST_MERGE_FILE);
    Measurement intoPipe = NewMeasurement(FIRST_MERGE_PIPE);
    const bool done = Repeat(merge, options_.pairs, [&] {
      if (!FirstMerge(merge, Output::Null, &memory)) {
        return false;
      }
      const std::optional<Fingerprint> rows = MeasureYardsticks(merge);
      for (const auto& [measurement, output] :
           {std::pair{&intoFile, Output::File}, std::pair{&intoPipe, Output::Pipe}}) {
        if (!FirstMerge(*measurement, output)) {
          return false;
        }
        measurement->horizon.push_back(merge.horizon.back());
        if (rows) {
          RequireSameRows(*rows, DatabaseFile());
        }
      }
      return true;
    });
    for (const Measurement& measurement : {merge, intoFile, intoPipe, memory}) {
      if (!measurement.daemon.empty() || measurement.gaveUp) {
        results_.measurements.push_back(measurement);
      }
    }
    return done;
  }

  bool FirstMerge(Measurement& merge, Output output, Measurement* memory = nullptr) const {
    std::filesystem::remove_all(DatabaseFolder());
    MeasuredDaemon daemon(master_, library_, output);
    if (!Time(merge, daemon)) {
      return false;
    }
    if (memory != nullptr) {
      memory->daemon.push_back(daemon.PeakOverIdle());
    }
    return true;
  }

  /// Merges all files again into the folders that have them. The floor and the horizon do not look
  /// for existing rows, so they merge the same catalog into a new database.
  bool MergesAgain() {
    MeasuredDaemon daemon(master_, library_);
    Measurement& merge = Add(MERGED_AGAIN);
    return Repeat(merge, options_.pairs, [&] {
      RestampEveryFile(library_.Path());
      if (!Time(merge, daemon)) {
        return false;
      }
      MeasureYardsticks(merge);
      return true;
    });
  }

  /// Returns the rows that all have written when it has compared them, which is in the first pair.
  std::optional<Fingerprint> MeasureYardsticks(Measurement& merge) const {
    merge.horizon.push_back(MergeByHorizon(CatalogPath(), HORIZON_DATABASE, library_.MountPoint()));
    if (merge.floor.size() < FLOOR_PAIRS) {
      merge.floor.push_back(MergeByFloor(CatalogPath(), FLOOR_DATABASE, library_.MountPoint()));
    }
    if (merge.horizon.size() > 1) {
      return std::nullopt;
    }
    RequireFiles(files_);
    const Fingerprint rows = TakeFingerprint(DatabaseFile());
    RequireSameRows(rows, FLOOR_DATABASE);
    RequireSameRows(rows, HORIZON_DATABASE);
    return rows;
  }

  bool UnchangedMerges(MeasuredDaemon& daemon) {
    const std::time_t newest = NewestStamp(library_.Path());
    Measurement& merge = Add(UNCHANGED_MERGE);
    return Repeat(merge, options_.pairs, [&] {
      if (!Time(merge, daemon)) {
        return false;
      }
      merge.shell.push_back(StepReaderStatements(CatalogPath(), newest));
      return true;
    });
  }

  bool Batches(MeasuredDaemon& daemon, const std::string& what, Names names) {
    Measurement& merge = Add(what);
    return Repeat(merge, options_.pairs, [&] {
      const std::time_t before = NewestStamp(library_.Path());
      AppendBatch(library_.Path(), BATCH_SIZE, names);
      if (!Time(merge, daemon)) {
        return false;
      }
      merge.shell.push_back(StepReaderStatements(CatalogPath(), before));
      present_ += BATCH_SIZE;
      RequireFiles(present_);
      return true;
    });
  }

  /// Adds files one by one to the only folder, with a merge for each. A value is the sum of them.
  bool SingleAdditions(MeasuredDaemon& daemon) {
    Measurement& merges = Add(SINGLE_ADDITIONS);
    return Repeat(merges, options_.pairs, [&] {
      Measurement single = NewMeasurement(SINGLE_ADDITIONS);
      for (int i = 0; i < ADDITIONS; ++i) {
        const std::time_t before = NewestStamp(library_.Path());
        AppendFile(library_.Path());
        if (!Time(single, daemon)) {
          merges.gaveUp = true;
          return false;
        }
        if (i % ADDITIONS_PER_SHELL == 0) {
          single.shell.push_back(StepReaderStatements(CatalogPath(), before));
        }
      }
      merges.daemon.push_back(Total(single.daemon));
      merges.shell.push_back(Total(single.shell) * ADDITIONS_PER_SHELL);
      present_ += ADDITIONS;
      RequireFiles(present_);
      return true;
    });
  }

  /// Adds a file of the same name to each folder. Every pair begins with the databases as they were
  /// before.
  bool Covers() {
    CopyDatabase(DatabaseFile(), DATABASE_BEFORE);
    MergeByHorizon(CatalogPath(), HORIZON_BEFORE, library_.MountPoint());
    const std::time_t before = NewestStamp(library_.Path());
    AddCovers(library_.Path());
    present_ += files_;
    Measurement& merge = Add(ONE_MORE_FILE);
    return Repeat(merge, options_.pairs, [&] {
      CopyDatabase(DATABASE_BEFORE, DatabaseFile());
      MeasuredDaemon daemon(master_, library_);
      if (!Time(merge, daemon)) {
        return false;
      }
      CopyDatabase(HORIZON_BEFORE, HORIZON_DATABASE);
      merge.horizon.push_back(
          AddByHorizon(CatalogPath(), HORIZON_DATABASE, library_.MountPoint(), before));
      RequireFiles(present_);
      if (merge.horizon.size() == 1) {
        RequireSameRows(TakeFingerprint(DatabaseFile()), HORIZON_DATABASE);
      }
      return true;
    });
  }

  /// Deletes all files. Every pair begins with the merged database as it was before.
  bool Deletions() {
    CopyDatabase(DatabaseFile(), DATABASE_BEFORE);
    ListFileIds(DATABASE_BEFORE, FILE_IDS);
    DeleteEveryFile(library_.Path());
    Measurement& deletion = Add(DELETE_ALL);
    return Repeat(deletion, options_.pairs, [&] {
      CopyDatabase(DATABASE_BEFORE, DatabaseFile());
      MeasuredDaemon daemon(master_, library_);
      if (!Time(deletion, daemon)) {
        return false;
      }
      CopyDatabase(DATABASE_BEFORE, SHELL_DATABASE);
      deletion.shell.push_back(DeleteByShell(SHELL_DATABASE, FILE_IDS));
      RequireFiles(0);
      RequireFiles(0, SHELL_DATABASE);
      return true;
    });
  }

  /// Calls `once` until it has succeeded `times` times, it fails, or the budget is used up.
  template <typename Once>
  bool Repeat(const Measurement& measurement, int times, Once once) const {
    Report(measurement.what);
    const auto begin = std::chrono::steady_clock::now();
    for (int i = 0; i < times; ++i) {
      if (!once()) {
        return false;
      }
      if (std::chrono::steady_clock::now() - begin > options_.budget) {
        break;
      }
    }
    return true;
  }

  bool Time(Measurement& measurement, MeasuredDaemon& daemon) const {
    const std::optional<double> seconds = daemon.Merge(options_.limit);
    if (seconds) {
      measurement.daemon.push_back(*seconds);
    } else {
      measurement.gaveUp = true;
    }
    return seconds.has_value();
  }

  void RequireFiles(long long files) const { RequireFiles(files, DatabaseFile()); }

  void RequireFiles(long long files, const std::string& path) const {
    db::DB database;
    database.Open(path);
    db::Statement count(database, "SELECT count(*) FROM Files");
    if (!count.Fetch() || count.GetInt64(0) != files) {
      throw std::runtime_error(path + " of " + shape_ + " does not have " + std::to_string(files) +
                               " files");
    }
  }

  void RequireSameRows(const Fingerprint& rows, const std::string& path) const {
    if (rows != TakeFingerprint(path)) {
      throw std::runtime_error("the rows in " + path + " of " + shape_ +
                               " are not those that the daemon wrote");
    }
  }

  Measurement NewMeasurement(const std::string& what) const {
    return {.what = what, .shape = shape_, .files = files_};
  }

  Measurement& Add(const std::string& what) {
    return results_.measurements.emplace_back(NewMeasurement(what));
  }

  void Report(const std::string& what) const {
    std::cerr << shape_ << ' ' << files_ << ": " << what << '\n';
  }

  std::string CatalogPath() const { return core::GetCatalogPath(library_.Path()); }
  std::string DatabaseFolder() const { return master_.MountPoint() + ".zophotos"; }
  std::string DatabaseFile() const { return DatabaseFolder() + "/zophotos.db"; }

  static inline const std::string FLOOR_DATABASE = "/tmp/floor.db";
  static inline const std::string HORIZON_DATABASE = "/tmp/horizon.db";
  static inline const std::string HORIZON_BEFORE = "/tmp/horizon-before.db";
  static inline const std::string DATABASE_BEFORE = "/tmp/before.db";
  static inline const std::string SHELL_DATABASE = "/tmp/shell.db";
  static inline const std::string FILE_IDS = "/tmp/ids.db";

  const Options& options_;
  Results& results_;
  const std::string shape_;
  const long long files_;
  long long present_; ///< files that the merged database has now
  // Larger than the shares root, which is a candidate for the election, too.
  const test::Volume master_{"Master", "150g"};
  const test::Volume library_{"Library", "50g"};
};

} // namespace

Results Measure(const Options& options) {
  Results results;
  for (const std::string& shape : options.shapes) {
    const std::vector<long long> fixed = FixedSizes(shape);
    for (const long long files : fixed.empty() ? options.sizes : fixed) {
      Case(options, results, shape, files).Run();
    }
  }
  return results;
}

} // namespace orva::bench
