// Names on the volumes and in /tmp that an untrusted user replaces while the daemon works. A tracer
// stops the daemon right before each call that takes one of the names, and the test replaces the
// name, its directory, or the journal next to it.

#include "Catalog.h"
#include "CraftedDatabase.h"
#include "Expectations.h"
#include "Messages.h"
#include "Replacement.h"
#include "Tracer.h"

#include "orvautil/FormatString.h"

#include "support/TestScale.h"

#include <sys/syscall.h>
#include <syslog.h>

#include <chrono>
#include <condition_variable>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <stdexcept>
#include <thread>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::IsEmpty;

/// The longest time for an event. A lease would stop an unprepared opening for 45 seconds.
constexpr std::chrono::seconds LONGEST_EVENT{20};

const std::string FOLDER = "/shares/Master/.zophotos";
const std::string MERGED = FOLDER + "/zophotos.db";
const std::string HOME = "/shares/Vol/.orva";
const std::string CATALOG = HOME + "/orva.db";
const std::string LOCATOR = "/tmp/zophotodbmerger.conf";

/// What the daemon does while a name is replaced.
enum class Work { Merge, ReMerge, FirstMerge, Removal };

const std::vector<Work> WORKS = {Work::Merge, Work::ReMerge, Work::FirstMerge, Work::Removal};

std::string NameOf(Work work) {
  return std::vector<std::string>{"Merge", "ReMerge", "FirstMerge", "Removal"}.at(
      static_cast<std::size_t>(work));
}

void PrintTo(Work work, std::ostream* stream) {
  *stream << NameOf(work);
}

/// The positions of the paths among the arguments of a system call.
std::vector<std::size_t> PathArguments(std::uint64_t number) {
  constexpr std::uint64_t fchmodat2 = 452; // newer than some headers
  switch (number) {
  case SYS_open:
  case SYS_creat:
  case SYS_stat:
  case SYS_lstat:
  case SYS_statfs:
  case SYS_access:
  case SYS_unlink:
  case SYS_mkdir:
  case SYS_rmdir:
  case SYS_chmod:
  case SYS_chown:
  case SYS_lchown:
  case SYS_readlink:
  case SYS_truncate:
    return {0};
  case SYS_rename:
  case SYS_link:
    return {0, 1};
  case SYS_openat:
  case SYS_openat2:
  case SYS_newfstatat:
  case SYS_statx:
  case SYS_faccessat:
  case SYS_faccessat2:
  case SYS_unlinkat:
  case SYS_mkdirat:
  case SYS_fchmodat:
  case fchmodat2:
  case SYS_fchownat:
  case SYS_readlinkat:
    return {1};
  case SYS_renameat:
  case SYS_renameat2:
  case SYS_linkat:
    return {1, 3};
  default:
    return {};
  }
}

std::string TextAt(pid_t process, std::uint64_t address) {
  std::ifstream memory("/proc/" + std::to_string(process) + "/mem", std::ios::binary);
  memory.seekg(static_cast<std::streamoff>(address));
  std::string text;
  std::getline(memory, text, '\0');
  return text;
}

/// The path that a name has on the volumes; empty for names that are not replaced.
std::string PlaceOf(const std::string& name) {
  if (name.starts_with("zophotos.db")) {
    return FOLDER + "/" + name;
  }
  if (name.starts_with("orva.db")) {
    return HOME + "/" + name;
  }
  for (const std::string& place : {FOLDER, HOME, LOCATOR}) {
    if (name == fs::path(place).filename()) {
      return place;
    }
  }
  return {};
}

/// The journal of the database that a name belongs to.
std::string JournalFor(const std::string& place) {
  for (const char* const suffix : {"-journal", "-wal", "-shm"}) {
    if (place.ends_with(suffix)) {
      return place.substr(0, place.rfind('-')) + "-journal";
    }
  }
  return place + "-journal";
}

/// The paths to replace before a call that takes these.
std::set<std::string> PlacesFor(const Lines& names) {
  std::set<std::string> places(names.begin(), names.end());
  for (const std::string& name : names) {
    if (name != FOLDER && name != HOME && name != LOCATOR) {
      places.insert({fs::path(name).parent_path(), JournalFor(name)});
    }
  }
  return places;
}

const LogLine KILLED = Error("killed: it has not answered in time");

/// Kills a process that is not done in time, and logs it, so that the test fails and does not hang.
class Watchdog {
public:
  explicit Watchdog(pid_t process)
      : thread_([process](const std::stop_token& done) {
          std::mutex mutex;
          std::unique_lock lock(mutex);
          std::condition_variable_any().wait_for(lock, done, LONGEST_EVENT, [] { return false; });
          if (!done.stop_requested()) {
            kill(process, SIGKILL);
            syslog(LOG_LOCAL1 | LOG_ERR, "%s", KILLED.text.c_str());
          }
        }) {}

private:
  std::jthread thread_;
};

/// A call that takes names.
struct Instant {
  std::size_t number; ///< among these calls
  std::uint64_t call;
  Lines names; ///< their paths
};

class ReplacedNames : public SystemTest,
                      public ::testing::WithParamInterface<std::tuple<Work, Replacement>> {
protected:
  void SetUp() override {
    Catalog(master_).AddPhoto("m.jpg", 1, 1000);
    Catalog catalog(vol_);
    catalog.AddFolder("a/", 11);
    catalog.AddPhoto("a/one.jpg", 1, 1000);
    std::ofstream(LOCATOR).flush();
    appliance.Start();
    appliance.Handle(Plugged(master_.Path()));
    appliance.Handle(Plugged(vol_.Path()));
    appliance.Handle(Scanned(master_.Path()));
    appliance.Handle(TranscodedBatch(master_.Path()));
    appliance.Handle(TranscodedBatch(vol_.Path()));
    merged_ = Bytes::Of(MERGED);
    catalog.AddPhoto("a/two.jpg", 2, 2000);
    catalog_ = Bytes::Of(CATALOG);
    volumes_.try_emplace(fs::path(FOLDER).parent_path(), "/shares/Master/spare",
                         std::vector{MERGED});
    volumes_.try_emplace(fs::path(HOME).parent_path(), "/shares/Vol/spare", std::vector{CATALOG});
    volumes_.try_emplace(fs::path(LOCATOR).parent_path(), "/tmp/spare", std::vector<std::string>());

    RestoreFiles();
    appliance.Handle(TranscodedBatch(vol_.Path()));
    good_ = MergedDatabase(master_.Path()).Content();
    descriptors_ = Descriptors();
  }

  /// Replaces names before each call of the work that takes one.
  void ReplaceEverywhere() {
    const std::vector<Instant> instants = Instants();
    ASSERT_FALSE(instants.empty());
    for (const Instant& instant : instants) {
      for (const std::string& place : PlacesFor(instant.names)) {
        for (const bool forOneCall : {false, true}) {
          if (!IsFor(kind_, fs::path(place).filename()) || !IsChosen(instant, place, forOneCall)) {
            continue;
          }
          SCOPED_TRACE(util::FormatString(
              "%s replaced before name call %zu (system call %llu on %s)%s", place.c_str(),
              instant.number, static_cast<unsigned long long>(instant.call),
              instant.names.front().c_str(), forOneCall ? ", for this call only" : ""));
          ReplaceAt(instant, place, forOneCall);
          if (HasFailure()) {
            return;
          }
        }
      }
    }
    EXPECT_EQ(descriptors_, Descriptors());
  }

private:
  /// Everything in the long form; otherwise the first call of each kind on each name.
  bool IsChosen(const Instant& instant, const std::string& place, bool forOneCall) {
    return chosen_.emplace(instant.call, instant.names.front(), place, forOneCall).second ||
           IsExtended();
  }

  std::string Message() const {
    switch (work_) {
    case Work::ReMerge:
      return Purged(vol_.Path());
    case Work::Removal:
      return Unplugged(vol_.Path());
    default:
      return TranscodedBatch(vol_.Path());
    }
  }

  /// The files before the work.
  void RestoreFiles() const {
    for (const std::string& path : {FOLDER, HOME, LOCATOR}) {
      fs::remove_all(path);
    }
    for (const std::string& folder : {FOLDER, HOME}) {
      fs::create_directory(folder);
      fs::permissions(folder, fs::perms(0777));
    }
    catalog_.Save(CATALOG);
    merged_.Save(MERGED);
    std::ofstream(LOCATOR).flush();
  }

  void PrepareWork() const {
    RestoreFiles();
    if (work_ == Work::FirstMerge) {
      fs::remove_all(FOLDER);
    }
  }

  /// The paths of the names that a call takes.
  Lines NamesOf(const SystemCall& call) const {
    Lines names;
    for (const std::size_t argument : PathArguments(call.number)) {
      const std::string path = TextAt(appliance.Daemon().Pid(), call.arguments.at(argument));
      const std::string place = PlaceOf(fs::path(path).filename());
      if (!place.empty()) {
        names.push_back(place);
      }
    }
    return names;
  }

  std::vector<Instant> Instants() {
    std::vector<Instant> instants;
    PrepareWork();
    {
      Tracer tracer(appliance.Daemon().Pid());
      appliance.Service().Send(Message());
      const std::string last = appliance.SendBarrier();
      tracer.RunUntil([&](const SystemCall& call) {
        const Lines names = NamesOf(call);
        if (!names.empty()) {
          instants.push_back({instants.size(), call.number, names});
        }
        return tracer.Data(call).find(last) != std::string::npos;
      });
    }
    Recover();
    return instants;
  }

  void ReplaceAt(const Instant& instant, const std::string& place, bool forOneCall) {
    PrepareWork();
    const Watchdog watchdog(appliance.Daemon().Pid());
    try {
      AwaitAnswer(Replace(instant, place, forOneCall));
    } catch (const std::exception& error) {
      ADD_FAILURE() << error.what();
      return;
    }
    Recover();
  }

  /// Starts the work and replaces the name. Returns the line that is logged after the work.
  std::string Replace(const Instant& instant, const std::string& place, bool forOneCall) {
    Tracer tracer(appliance.Daemon().Pid());
    appliance.Service().Send(Message());
    const std::string last = appliance.SendBarrier();
    std::size_t calls = 0;
    pid_t thread = 0;
    bool ended = false;
    tracer.RunUntil([&](const SystemCall& call) {
      thread = call.thread;
      ended = tracer.Data(call).find(last) != std::string::npos;
      return ended || (!NamesOf(call).empty() && calls++ == instant.number);
    });
    if (!ended) {
      Replacer& replacer = replacer_.emplace(volumes_.at(VolumeOf(place)));
      replacer.Replace(kind_, place);
      if (forOneCall) {
        tracer.RunUntil([&](const SystemCall& call) { return call.thread == thread; });
        replacer.Return();
      }
    }
    return last;
  }

  void AwaitAnswer(const std::string& last) {
    bool killed = false;
    const bool ended = appliance.Log().Await(
        [&, searched = std::size_t{0}](const std::vector<LogLine>& lines) mutable {
          for (; searched < lines.size(); ++searched) {
            killed = killed || lines[searched] == KILLED;
            if (killed || lines[searched] == Error(last)) {
              return true;
            }
          }
          return false;
        });
    if (killed || !ended) {
      throw std::runtime_error("the daemon has not answered");
    }
  }

  static std::string VolumeOf(const std::string& place) {
    for (const std::string& path : {FOLDER, HOME, LOCATOR}) {
      if (place.starts_with(path)) {
        return fs::path(path).parent_path();
      }
    }
    return {};
  }

  /// Expects that nothing was harmed, puts the files back as an administrator would, and expects
  /// that the daemon continues.
  void Recover() {
    for (auto& [volume, files] : volumes_) {
      EXPECT_THAT(files.Changes(), IsEmpty());
    }
    RestoreFiles();
    appliance.TakeLog();
    Log log;
    if (work_ == Work::Removal) {
      log = appliance.Handle(Unplugged(vol_.Path())) + appliance.Handle(Plugged(vol_.Path()));
      EXPECT_EQ("zophotos_db_path=/shares/Master//.zophotos/zophotos.db\n", Appliance::Locator());
    }
    log = log + appliance.Handle(TranscodedBatch(vol_.Path()));
    for (const LogLine& line : log) {
      EXPECT_NE(Error("").priority, line.priority) << line.text;
    }
    EXPECT_EQ(good_, MergedDatabase(master_.Path()).Content());
    for (auto& [volume, files] : volumes_) {
      EXPECT_THAT(files.Changes(), IsEmpty());
    }
  }

  std::size_t Descriptors() const {
    const fs::path directory = "/proc/" + std::to_string(appliance.Daemon().Pid()) + "/fd";
    return static_cast<std::size_t>(
        std::distance(fs::directory_iterator(directory), fs::directory_iterator()));
  }

  const Work work_ = std::get<0>(GetParam());
  const Replacement kind_ = std::get<1>(GetParam());
  const Volume master_{"Master", "150g"};
  const Volume vol_{"Vol", "1g"};
  Bytes merged_;
  Bytes catalog_;
  Lines good_; ///< what the merged database holds after a good merge
  std::size_t descriptors_ = 0;
  std::map<std::string, PrivateFiles> volumes_; ///< by the directory that the names are below
  std::optional<Replacer> replacer_;
  std::set<std::tuple<std::uint64_t, std::string, std::string, bool>> chosen_;
};

TEST_P(ReplacedNames, HarmNothing) {
  ReplaceEverywhere();
}

INSTANTIATE_TEST_SUITE_P(At, ReplacedNames,
                         ::testing::Combine(::testing::ValuesIn(WORKS),
                                            ::testing::ValuesIn(REPLACEMENTS)),
                         [](const auto& tested) {
                           return NameOf(std::get<0>(tested.param)) + "With" +
                                  NameOf(std::get<1>(tested.param));
                         });

} // namespace
} // namespace orva::test
