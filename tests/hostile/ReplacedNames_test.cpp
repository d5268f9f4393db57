// Names on the volumes and in /tmp that an untrusted user replaces while the daemon works. A tracer
// stops the daemon right before each call that takes one of the names, and the test replaces the
// name, its directory, or the journal next to it.

#include "Messages.h"
#include "NamesTest.h"
#include "Tracer.h"

#include "orvautil/FormatString.h"

#include "support/TestScale.h"

#include <sys/syscall.h>

#include <filesystem>
#include <fstream>
#include <optional>
#include <set>

namespace orva::test {
namespace {

namespace fs = std::filesystem;

/// What the daemon does while a name is replaced.
enum class Work { Merge, ReMerge, FirstMerge, Removal };

const std::vector<Work> EVERY_WORK = {Work::Merge, Work::ReMerge, Work::FirstMerge, Work::Removal};

const Lines EVERY_NAME = Lines{MERGED_FOLDER, CATALOG_FOLDER, LOCATOR_FILE} +
                         WithLogs(MERGED_FILE) + WithLogs(MERGED_FILE + ".new") +
                         WithLogs(CATALOG_FILE);

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
    return MERGED_FOLDER + "/" + name;
  }
  if (name.starts_with("orva.db")) {
    return CATALOG_FOLDER + "/" + name;
  }
  for (const std::string& place : {MERGED_FOLDER, CATALOG_FOLDER, LOCATOR_FILE}) {
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
    if (name != MERGED_FOLDER && name != CATALOG_FOLDER && name != LOCATOR_FILE) {
      places.insert({fs::path(name).parent_path(), JournalFor(name)});
    }
  }
  return places;
}

/// A call that takes names.
struct Instant {
  std::size_t number; ///< among these calls
  std::uint64_t call;
  Lines names; ///< their paths
};

class ReplacedNames : public NamesTest,
                      public ::testing::WithParamInterface<std::tuple<Work, Replacement>> {
protected:
  /// Replaces each name before the work.
  void ReplaceBefore() {
    for (const std::string& place : EVERY_NAME) {
      if (IsFor(kind_, fs::path(place).filename()) && !HasFailure()) {
        SCOPED_TRACE(place + " replaced before the work");
        Expect([&] {
          replacer_.emplace(FilesFor(place)).Replace(kind_, place);
          appliance.Service().Send(Message());
          return appliance.SendBarrier();
        });
      }
    }
  }

  /// Replaces names before each call of the work that takes one.
  void ReplaceDuring() {
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
          Expect([&] { return Replace(instant, place, forOneCall); });
          if (HasFailure()) {
            return;
          }
        }
      }
    }
  }

private:
  /// Everything in the long form; otherwise the first call of each kind on each name, and for one
  /// call only those that open something.
  bool IsChosen(const Instant& instant, const std::string& place, bool forOneCall) {
    const bool isFirst =
        chosen_.emplace(instant.call, instant.names.front(), place, forOneCall).second;
    return IsExtended() || (isFirst && (!forOneCall || instant.call == SYS_openat));
  }

  std::string Message() const {
    switch (work_) {
    case Work::ReMerge:
      return Purged(vol.Path());
    case Work::Removal:
      return Unplugged(vol.Path());
    default:
      return TranscodedBatch(vol.Path());
    }
  }

  void PrepareWork() const {
    RestoreFiles();
    if (work_ == Work::FirstMerge) {
      fs::remove_all(MERGED_FOLDER);
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

  /// Prepares the work, calls `start`, which returns the line that is logged after it, and expects
  /// that the daemon ends the work, that nothing was harmed and that the daemon continues.
  template <typename Start>
  void Expect(Start start) {
    PrepareWork();
    const Watchdog watchdog(appliance.Daemon().Pid());
    try {
      AwaitAnswer(start());
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
    std::string last = appliance.SendBarrier();
    std::size_t calls = 0;
    pid_t thread = 0;
    bool ended = false;
    tracer.RunUntil([&](const SystemCall& call) {
      thread = call.thread;
      ended = tracer.Data(call).find(last) != std::string::npos;
      return ended || (!NamesOf(call).empty() && calls++ == instant.number);
    });
    if (!ended) {
      Replacer& replacer = replacer_.emplace(FilesFor(place));
      replacer.Replace(kind_, place);
      if (forOneCall) {
        tracer.RunUntil([&](const SystemCall& call) { return call.thread == thread; });
        replacer.Return();
      }
    }
    return last;
  }

  void Recover() {
    ExpectPrivateFilesUnchanged();
    RestoreFiles();
    ExpectGoodMerge(work_ == Work::Removal);
  }

  const Work work_ = std::get<0>(GetParam());
  const Replacement kind_ = std::get<1>(GetParam());
  std::optional<Replacer> replacer_;
  std::set<std::tuple<std::uint64_t, std::string, std::string, bool>> chosen_;
};

TEST_P(ReplacedNames, HarmNothing) {
  ReplaceBefore();
  ReplaceDuring();
  ExpectNoMoreDescriptors();
}

INSTANTIATE_TEST_SUITE_P(At, ReplacedNames,
                         ::testing::Combine(::testing::ValuesIn(EVERY_WORK),
                                            ::testing::ValuesIn(REPLACEMENTS)),
                         [](const auto& tested) {
                           return NameOf(std::get<0>(tested.param)) + "With" +
                                  NameOf(std::get<1>(tested.param));
                         });

} // namespace
} // namespace orva::test
