// Measures the snapshot of zophotos-web: compared with the real daemon's merge of the same catalog,
// or against limits. Started in a private root; --photos N for another size than 1,000,000.

#include "driver/CatalogChanges.h"
#include "driver/MeasuredDaemon.h"

#include "CatalogSchema.h"
#include "Generator.h"

#include "orvadb/VolumeDB.h"

#include "zophotos-web/SnapshotReader.h"
#include "zophotos/Locator.h"

#include <malloc.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <ctime>
#include <exception>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iostream>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

namespace {

using namespace orva;
using bench::MeasuredDaemon;

constexpr int PAIRS = 3;
constexpr int MERGES = 20;
constexpr int BATCH = 100;
constexpr int REPETITIONS = 15;
constexpr int READERS = 2;
constexpr std::size_t PAGE = 100;
constexpr std::chrono::seconds LIMIT(120);
constexpr double LONGEST_WAIT = 10; ///< seconds until a merge counts as undone
constexpr std::chrono::milliseconds BETWEEN_UPDATES(250);
const std::string CACHE = "/tmp/web-cache";

double Now() {
  return std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count();
}

template <typename Work>
double Seconds(const Work& work) {
  const double begin = Now();
  work();
  return Now() - begin;
}

double Median(std::vector<double> values) {
  std::ranges::sort(values);
  return values.at(values.size() / 2);
}

double Worst(const std::vector<double>& values) {
  return *std::ranges::max_element(values);
}

void Figure(const std::string& what, double is, double limit) {
  std::printf("%-62s %9.2f   %8s %-5g %s\n", what.c_str(), is, "at most", limit,
              is <= limit ? "ok" : "MISSED");
  std::fflush(stdout);
}

void ResetPeakMemory() {
  malloc_trim(0);
  std::ofstream("/proc/self/clear_refs") << 5;
}

double PeakMemoryMiB() {
  std::ifstream status("/proc/self/status");
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with("VmHWM:")) {
      return std::stod(line.substr(6)) / 1024;
    }
  }
  throw std::runtime_error("no peak memory");
}

double Merge(MeasuredDaemon& daemon) {
  const auto seconds = daemon.Merge(LIMIT);
  if (!seconds) {
    throw std::runtime_error("the merge takes too long");
  }
  return *seconds;
}

class Measurement {
public:
  explicit Measurement(long long photos) : photos_(photos) {}

  void Run() {
    Generate();
    FirstMerges();
    Reads();
    Changes();
  }

private:
  void Generate() const {
    const auto database = catalog::OpenCatalog(library_.Path());
    catalog::Generate(*database, {.files = photos_, .perFolder = 100}, std::time(nullptr));
    catalog::Checkpoint(*database);
  }

  void FirstMerges() {
    std::vector<double> merges;
    std::vector<double> builds;
    std::vector<double> memory;
    for (int pair = 0; pair < PAIRS; ++pair) {
      snapshot_.reset();
      std::filesystem::remove_all(CACHE);
      daemon_.reset();
      std::filesystem::remove_all(master_.Path() + "/.zophotos");
      daemon_ = std::make_unique<MeasuredDaemon>(master_, library_);
      merges.push_back(Merge(*daemon_));
      ResetPeakMemory();
      builds.push_back(Seconds([this] {
        snapshot_ = std::make_unique<web::Snapshot>(CACHE, zophotos::FindDatabase);
        snapshot_->Update();
      }));
      memory.push_back(PeakMemoryMiB());
      if (snapshot_->Status().state != web::SnapshotStatus::State::Current) {
        throw std::runtime_error(snapshot_->Status().reason);
      }
    }
    std::printf("first merge: %.2f s; snapshot: %.2f s\n", Median(merges), Median(builds));
    Figure("first merge: snapshot and search index / merge", Median(builds) / Median(merges), 3);
    Figure("peak memory with the snapshot's build, MiB", Worst(memory), 96);
  }

  void Read(const std::string& what, const std::function<void()>& read) {
    std::vector<double> times;
    times.reserve(REPETITIONS);
    for (int i = 0; i < REPETITIONS; ++i) {
      times.push_back(Seconds(read) * 1000);
    }
    Figure(what + ": median, ms", Median(times), 10);
    Figure(what + ": worst, ms", Worst(times), 100);
  }

  /// At once after the build, and when the search index has been tidied.
  void Reads() {
    ReadsOnce("");
    for (int i = 0; i < 1'000; ++i) {
      snapshot_->Update();
    }
    ReadsOnce(", tidied");
  }

  void ReadsOnce(const std::string& when) {
    web::SnapshotReader reader(*snapshot_);
    const auto page = [&reader](const web::Filter& filter) {
      reader.Photos(filter, std::nullopt, PAGE);
    };
    const auto words = [](const std::string& text) {
      web::Filter filter;
      filter.words = text;
      return filter;
    };
    const web::PhotoId middle = web::PhotoId{1'500'000'000LL + 0x8000'0000LL + photos_ / 2} << 31;
    Read("grid page" + when, [&] { page({}); });
    Read("grid page in the middle" + when, [&] { reader.Photos({}, middle, PAGE); });
    web::Filter folder;
    folder.folder = reader.Folders(1, {}, 1).at(0).id + 1;
    Read("photos of a folder" + when, [&] { page(folder); });
    Read("folders of a volume" + when, [&] { reader.Folders(*folder.folder - 1, {}, PAGE); });
    web::Filter volume;
    volume.volume = library_.MountPoint();
    Read("photos of a volume" + when, [&] { page(volume); });
    Read("months of a volume" + when, [&] { reader.Months(volume); });
    for (const char* const text : {"photo", "00012345", "jpg 5000", "photo nothing", "0", "p", "9",
                                   "photo 00 jpg folder 0001 00000001"}) {
      Read(std::string("words '") + text + "'" + when, [&] { page(words(text)); });
    }
    web::Filter all = volume;
    all.words = "jpg";
    Read("words of a volume in the middle" + when, [&] { reader.Photos(all, middle, PAGE); });
  }

  /// Merges of 100 photos, first alone, then with a snapshot that follows and two readers.
  void Changes() {
    std::vector<double> alone;
    for (int i = 0; i < MERGES; ++i) {
      bench::AppendBatch(library_.Path(), BATCH, catalog::Names::Unique);
      alone.push_back(Merge(*daemon_));
    }
    while (snapshot_->Update()) {
    }
    std::atomic<std::int64_t> version = web::SnapshotReader(*snapshot_).Version();
    std::jthread updates([&](const std::stop_token& stop) {
      web::SnapshotReader reader(*snapshot_);
      while (!stop.stop_requested()) {
        if (snapshot_->Update(stop)) {
          version = reader.Version();
        }
        std::this_thread::sleep_for(BETWEEN_UPDATES);
      }
    });
    std::vector<std::jthread> readers;
    readers.reserve(READERS);
    for (int i = 0; i < READERS; ++i) {
      readers.emplace_back([this](const std::stop_token& stop) {
        web::SnapshotReader reader(*snapshot_);
        std::optional<web::PhotoId> before;
        while (!stop.stop_requested()) {
          const auto photos = reader.Photos({}, before, PAGE);
          before = photos.empty() ? std::nullopt : std::optional(photos.back().id);
          std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
      });
    }
    std::vector<double> together;
    std::vector<double> visible;
    int undone = 0;
    for (int i = 0; i < MERGES; ++i) {
      const std::int64_t before = version;
      bench::AppendBatch(library_.Path(), BATCH, catalog::Names::Unique);
      together.push_back(Merge(*daemon_));
      const double end = Now();
      while (version == before && Now() < end + LONGEST_WAIT) {
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
      }
      visible.push_back(Now() - end);
      undone += version == before ? 1 : 0;
    }
    Figure("merges of 100 undone, of 20", undone, 0);
    Figure("a merge of 100: until the snapshot shows it, worst, s", Worst(visible), 1);
    std::printf(
        "merges of 100: median %.3f s, worst %.3f s; followed: median %.3f s, worst %.3f s\n",
        Median(alone), Worst(alone), Median(together), Worst(together));
    Figure("a merge of 100: delay by the snapshot, median, s", Median(together) - Median(alone),
           0.1);
    Figure("a merge of 100: delay by the snapshot, worst, s", Worst(together) - Worst(alone), 0.1);
  }

  const long long photos_;
  const test::Volume master_{"Master", "150g"};
  const test::Volume library_{"Library", "50g"};
  std::unique_ptr<MeasuredDaemon> daemon_;
  std::unique_ptr<web::Snapshot> snapshot_;
};

} // namespace

int main(int argc, char** argv) {
  try {
    const std::vector<std::string> arguments(argv + 1, argv + argc);
    const bool hasSize = arguments.size() == 2 && arguments[0] == "--photos";
    if (!arguments.empty() && !hasSize) {
      std::cerr << "usage: web_snapshot_bench [--photos N]\n";
      return 2;
    }
    Measurement(hasSize ? std::stoll(arguments[1]) : 1'000'000).Run();
    return 0;
  } catch (const std::exception& error) {
    std::cerr << "web_snapshot_bench: " << error.what() << '\n';
  } catch (const std::string& error) { // the database layer's
    std::cerr << "web_snapshot_bench: " << error << '\n';
  }
  return 1;
}
