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

#include <algorithm>
#include <filesystem>
#include <iostream>
#include <optional>
#include <stdexcept>

namespace orva::bench {

namespace {

constexpr int BATCH_SIZE = 100;
/// The largest catalog whose deletion is measured more than once, as all files must be merged again
/// in between.
constexpr long long MOST_FILES_DELETED_AGAIN = 100'000;
/// The only size of the shape "folders", which measures the unchanged merge.
constexpr long long MANY_FOLDERS = 100'000;

catalog::GeneratorPlan PlanOf(const std::string& shape, long long files) {
  using catalog::Names;
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
  if (shape == "folders") {
    return {.files = files, .perFolder = 1};
  }
  return {.files = files, .perFolder = 1000, .names = Names::Camera}; // camera, restamped
}

/// The measurements of one catalog, from the first merge of its files to their deletion.
class Case {
public:
  Case(const Options& options, Results& results, std::string shape, long long files)
      : options_(options), results_(results), shape_(std::move(shape)), files_(files) {}

  void Run() {
    Generate();
    if (shape_ == "restamped" || shape_ == "folders") {
      MeasuredDaemon daemon(master_, library_);
      Report("merging");
      if (!daemon.Merge(options_.limit)) {
        Add(FIRST_MERGE).gaveUp = true;
        return;
      }
    }
    if (shape_ == "folders") {
      MeasuredDaemon daemon(master_, library_);
      UnchangedMerges(daemon);
      return;
    }
    if (!(shape_ == "restamped" ? MergesAgain() : FirstMerges())) {
      return;
    }
    MeasuredDaemon daemon(master_, library_);
    if (UnchangedMerges(daemon) && Batches(daemon)) {
      Deletions(daemon);
    }
  }

private:
  void Generate() const {
    Report("generating");
    const auto database = catalog::OpenCatalog(library_.Path());
    catalog::Generate(*database, PlanOf(shape_, files_), std::time(nullptr));
    catalog::Checkpoint(*database);
  }

  /// Merges the whole catalog into a new database, each time with a new daemon.
  bool FirstMerges() {
    Measurement memory{.what = PEAK_MEMORY, .shape = shape_, .files = files_};
    Measurement& merge = Add(FIRST_MERGE);
    const bool done = Repeat(merge, options_.pairs, [&] {
      std::filesystem::remove_all(DatabaseFolder());
      MeasuredDaemon daemon(master_, library_);
      if (!Time(merge, daemon)) {
        return false;
      }
      memory.daemon.push_back(daemon.PeakOverIdle());
      MeasureYardsticks(merge);
      return true;
    });
    if (!memory.daemon.empty()) {
      results_.measurements.push_back(memory);
    }
    return done;
  }

  /// Merges all files again into the folders that have them. The floor and the horizon do not look
  /// for existing rows, so they merge the same catalog into a new database.
  bool MergesAgain() {
    MeasuredDaemon daemon(master_, library_);
    Measurement& merge = Add(FIRST_MERGE);
    return Repeat(merge, options_.pairs, [&] {
      RestampEveryFile(library_.Path());
      if (!Time(merge, daemon)) {
        return false;
      }
      MeasureYardsticks(merge);
      return true;
    });
  }

  void MeasureYardsticks(Measurement& merge) const {
    merge.floor.push_back(MergeByFloor(CatalogPath(), FLOOR_DATABASE, library_.MountPoint()));
    merge.horizon.push_back(MergeByHorizon(CatalogPath(), HORIZON_DATABASE, library_.MountPoint()));
    if (merge.floor.size() > 1) {
      return;
    }
    const Fingerprint rows = TakeFingerprint(DatabaseFile());
    if (rows.files.count != static_cast<std::uint64_t>(files_) ||
        rows != TakeFingerprint(FLOOR_DATABASE) || rows != TakeFingerprint(HORIZON_DATABASE)) {
      throw std::runtime_error("daemon, floor and horizon wrote different rows for " + shape_);
    }
  }

  bool UnchangedMerges(MeasuredDaemon& daemon) {
    const std::time_t newest = NewestStamp(library_.Path());
    Measurement& merge = Add(UNCHANGED_MERGE);
    return Repeat(merge, options_.pairs, [&] {
      if (!Time(merge, daemon)) {
        return false;
      }
      merge.floor.push_back(StepReaderStatements(CatalogPath(), newest));
      return true;
    });
  }

  bool Batches(MeasuredDaemon& daemon) {
    Measurement& merge = Add(BATCH_OF_100);
    return Repeat(merge, options_.pairs, [&] {
      const std::time_t before = NewestStamp(library_.Path());
      AppendBatch(library_.Path(), BATCH_SIZE);
      if (!Time(merge, daemon)) {
        return false;
      }
      merge.floor.push_back(StepReaderStatements(CatalogPath(), before));
      RequireFiles(files_ + static_cast<long long>(merge.daemon.size()) * BATCH_SIZE);
      return true;
    });
  }

  bool Deletions(MeasuredDaemon& daemon) {
    Measurement& deletion = Add(DELETE_ALL);
    const int times = files_ > MOST_FILES_DELETED_AGAIN ? 1 : options_.pairs;
    return Repeat(deletion, times, [&] {
      if (!deletion.daemon.empty()) {
        ReviveEveryFile(library_.Path());
        if (!daemon.Merge(options_.limit)) {
          return false;
        }
      }
      DeleteEveryFile(library_.Path());
      if (!Time(deletion, daemon)) {
        return false;
      }
      RequireFiles(0);
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

  void RequireFiles(long long files) const {
    db::DB database;
    database.Open(DatabaseFile());
    db::Statement count(database, "SELECT count(*) FROM Files");
    if (!count.Fetch() || count.GetInt64(0) != files) {
      throw std::runtime_error("the merged database of " + shape_ + " does not have " +
                               std::to_string(files) + " files");
    }
  }

  Measurement& Add(const std::string& what) {
    return results_.measurements.emplace_back(
        Measurement{.what = what, .shape = shape_, .files = files_});
  }

  void Report(const std::string& what) const {
    std::cerr << shape_ << ' ' << files_ << ": " << what << '\n';
  }

  std::string CatalogPath() const { return core::GetCatalogPath(library_.Path()); }
  std::string DatabaseFolder() const { return master_.MountPoint() + ".zophotos"; }
  std::string DatabaseFile() const { return DatabaseFolder() + "/zophotos.db"; }

  static inline const std::string FLOOR_DATABASE = "/tmp/floor.db";
  static inline const std::string HORIZON_DATABASE = "/tmp/horizon.db";

  const Options& options_;
  Results& results_;
  const std::string shape_;
  const long long files_;
  // Larger than the shares root, which is a candidate for the election, too.
  const test::Volume master_{"Master", "150g"};
  const test::Volume library_{"Library", "50g"};
};

} // namespace

Results Measure(const Options& options) {
  Results results;
  for (const std::string& shape : options.shapes) {
    for (const long long files :
         shape == "folders" ? std::vector<long long>{MANY_FOLDERS} : options.sizes) {
      Case(options, results, shape, files).Run();
    }
  }
  return results;
}

} // namespace orva::bench
