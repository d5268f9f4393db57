#include "Catalog.h"
#include "Expectations.h"
#include "Messages.h"
#include "Tracer.h"

#include "support/TestScale.h"

#include <sys/syscall.h>

#include <algorithm>
#include <csignal>
#include <filesystem>
#include <iterator>
#include <map>
#include <memory>
#include <random>

namespace orva::test {
namespace {

using ::testing::Contains;
using ::testing::IsEmpty;

/// A step of a run: a message to the daemon. The start of the daemon is a step, too.
struct Step {
  std::string name;
  std::string message; ///< empty for the start
  bool followsChanges = false;
};

/// The phases in which a kill can come; the log lines of a merge separate its phases.
const Lines PHASES_OF_A_RUN{"first merge",
                            "first merge of B",
                            "first merge of B, commit",
                            "first merge of B, files",
                            "first merge of B, folders",
                            "first merge, commit",
                            "first merge, files",
                            "first merge, folders",
                            "next merge",
                            "next merge, commit",
                            "next merge, files",
                            "next merge, folders",
                            "plug of A",
                            "plug of B",
                            "re-merge",
                            "re-merge, commit",
                            "re-merge, files",
                            "re-merge, folders",
                            "removal",
                            "scan",
                            "start",
                            "start over an old database"};

/// The instant of a kill: before the effect of this number in a step.
struct Instant {
  Step step;
  bool old; ///< whether the shares root has a database of an earlier run
  std::size_t effect;
};

/// Everything that a run has left and that a daemon or another program can see.
Lines Observe() {
  EXPECT_THAT(MergedDatabase("/shares/A").Faults(), IsEmpty());
  EXPECT_THAT(MergedDatabase("/shares").Faults(), IsEmpty());
  Lines seen = MergedDatabase("/shares/A").Content();
  for (const Lines& more : {MergedDatabase("/shares").Content(), PathsBelow("/shares"),
                            PathsBelow("/tmp/daemon"), Lines{Appliance::Locator()}}) {
    seen.insert(seen.end(), more.begin(), more.end());
  }
  return seen;
}

/// The lines that are only in one of two lists.
Lines Difference(Lines expected, Lines actual) {
  std::sort(expected.begin(), expected.end());
  std::sort(actual.begin(), actual.end());
  Lines difference;
  std::set_symmetric_difference(expected.begin(), expected.end(), actual.begin(), actual.end(),
                                std::back_inserter(difference));
  return difference;
}

/// The run has logged no error.
void ExpectNoErrors(Appliance& appliance) {
  for (const LogLine& line : appliance.TakeLog()) {
    EXPECT_NE(Error("").priority, line.priority) << line.text;
  }
}

/// A run is a fixed sequence of steps, from the first start of a daemon to the removal of a volume.
/// The daemon of a run may be killed; another daemon then does the same steps again.
class Kill : public ::testing::Test {
protected:
  void SetUp() override {
    for (const Volume* volume : {&a, &b}) {
      Catalog catalog(*volume);
      FillCatalog(catalog, volume == &a ? 40 : 10);
      Keep(*volume, "before");
      ChangeCatalog(catalog);
      Keep(*volume, "after");
    }
  }

  static void FillCatalog(Catalog& catalog, int folders) {
    catalog.Rows().Run("BEGIN");
    for (int i = 0; i < folders; ++i) {
      catalog.AddFolder(Folder(i), 500 + i);
      catalog.AddPhotos(Folder(i), 30, 1000 + i);
    }
    catalog.Rows().Run("COMMIT");
  }

  /// Adds folders, adds photos to a folder, and deletes folders with their photos and single
  /// photos.
  static void ChangeCatalog(Catalog& catalog) {
    catalog.Rows().Run("BEGIN");
    for (int i = 50; i < 55; ++i) {
      catalog.AddFolder(Folder(i), 500 + i);
      catalog.AddPhotos(Folder(i), 20, 2000);
    }
    catalog.AddPhotos(Folder(7), 40, 2000, 30);
    for (int i = 0; i < 5; ++i) {
      catalog.DeleteFolder(Folder(i));
      for (int photo = 0; photo < 30; ++photo) {
        catalog.DeletePhoto(Folder(i) + std::to_string(photo) + ".jpg", 2001);
      }
      catalog.DeletePhoto(Folder(6) + std::to_string(i) + ".jpg", 2001);
    }
    catalog.Rows().Run("COMMIT");
  }

  static std::string Folder(int i) { return "Folder" + std::to_string(i) + "/"; }

  static std::filesystem::path Kept(const Volume& volume, const std::string& version) {
    return "/tmp/" + version + std::filesystem::path(volume.Path()).filename().string();
  }
  static std::filesystem::path CatalogOf(const Volume& volume) {
    return volume.Path() + "/.orva/orva.db";
  }

  static void Keep(const Volume& volume, const std::string& version) {
    std::filesystem::copy_file(CatalogOf(volume), Kept(volume, version));
  }

  void ShowCatalogs(const std::string& version) const {
    for (const Volume* volume : {&a, &b}) {
      std::filesystem::copy_file(Kept(*volume, version), CatalogOf(*volume),
                                 std::filesystem::copy_options::overwrite_existing);
    }
  }

  /// An appliance on which no daemon has run yet, or, with `old`, one whose shares root has the
  /// database of an earlier run.
  std::unique_ptr<Appliance> NewAppliance(bool old) const {
    for (const char* const place : {"/shares/.zophotos", "/shares/A/.zophotos", "/tmp/daemon"}) {
      std::filesystem::remove_all(place);
    }
    ShowCatalogs("before");
    if (old) {
      std::filesystem::create_directory("/shares/.zophotos");
      std::filesystem::copy_file("/tmp/old.db", "/shares/.zophotos/zophotos.db");
    }
    return std::make_unique<Appliance>();
  }

  /// Runs a step with a traced daemon. Calls `holds` with the phase before each effect.
  void Trace(Appliance& appliance, const Step& step,
             const std::function<bool(const std::string&)>& holds) const {
    if (step.followsChanges) {
      ShowCatalogs("after");
    }
    std::string last = "Calling ReadMessage()";
    if (step.message.empty()) {
      appliance.Prepare();
    }
    Tracer tracer(appliance.Daemon().Pid());
    if (step.message.empty()) {
      kill(appliance.Daemon().Pid(), SIGCONT);
    } else {
      appliance.Service().Send(step.message);
      last = appliance.SendBarrier();
    }
    std::string phase = step.name;
    bool killed = false;
    tracer.RunUntil([&](const SystemCall& call) {
      if (!IsEffect(call)) {
        return false;
      }
      const std::string data = tracer.Data(call);
      // The merger's own thread logs the volumes at any time.
      killed = data.find("Iterating over") == std::string::npos && holds(phase);
      for (const auto& [text, next] : PHASES) {
        if (call.number == SYS_sendto && data.find(text) != std::string::npos) {
          phase = step.name + next;
        }
      }
      return killed || data.find(last) != std::string::npos;
    });
    if (killed) {
      kill(appliance.Daemon().Pid(), SIGKILL);
    }
  }

  void RunStep(Appliance& appliance, const Step& step) const {
    if (step.followsChanges) {
      ShowCatalogs("after");
    }
    if (step.message.empty()) {
      appliance.Start();
    } else {
      appliance.Handle(step.message);
    }
  }

  /// Records the instants of all steps, and those of another start over an existing database.
  void Record() {
    auto appliance = NewAppliance(false);
    for (const Step& step : steps) {
      Record(*appliance, step, false);
    }
    EXPECT_EQ(Exited(0), appliance->Shutdown());
    appliance.reset();
    std::filesystem::copy_file("/shares/A/.zophotos/zophotos.db", "/tmp/old.db");
    appliance = NewAppliance(true);
    Record(*appliance, {"start over an old database", ""}, true);
    EXPECT_EQ(Exited(0), appliance->Shutdown());
  }

  void Record(Appliance& appliance, const Step& step, bool old) {
    std::size_t effect = 0;
    Trace(appliance, step, [&](const std::string& phase) {
      instants[phase].push_back({step, old, effect++});
      return false;
    });
    appliance.Barrier();
  }

  Lines Phases() const {
    Lines phases;
    for (const auto& [phase, all] : instants) {
      phases.push_back(phase);
    }
    return phases;
  }

  /// The run of a daemon that is killed.
  void RunUntil(const Instant& instant) const {
    const auto appliance = NewAppliance(instant.old);
    for (auto step = steps.begin(); !instant.old && step->name != instant.step.name; ++step) {
      RunStep(*appliance, *step);
    }
    std::size_t effect = 0;
    Trace(*appliance, instant.step,
          [&](const std::string& /*phase*/) { return effect++ == instant.effect; });
    // The daemon still runs when it had fewer effects this time.
    kill(appliance->Daemon().Pid(), SIGKILL);
    EXPECT_EQ(Killed(SIGKILL), appliance->Daemon().AwaitEnd());
  }

  /// The run of a daemon on the files that a killed one has left. Returns what can be seen after
  /// the merges of both volumes, and at the end.
  std::pair<Lines, Lines> RunAgain() const {
    ShowCatalogs("after");
    Appliance appliance;
    appliance.Start();
    for (std::size_t i = 1; i <= 5; ++i) {
      appliance.Handle(steps[i].message);
    }
    std::pair<Lines, Lines> seen{Observe(), {}};
    for (const std::size_t i : {6U, 7U, 8U, 2U, 5U}) {
      appliance.Handle(steps[i].message);
    }
    seen.second = Observe();
    ExpectNoErrors(appliance);
    EXPECT_EQ(Exited(0), appliance.Shutdown());
    return seen;
  }

  std::map<std::string, std::vector<Instant>> instants; ///< by phase
  const Volume a{"A", "150g"};
  const Volume b{"B", "1g"};
  const std::vector<Step> steps{{"start", ""},
                                {"plug of A", Plugged(a.Path())},
                                {"plug of B", Plugged(b.Path())},
                                {"scan", Scanned(a.Path())},
                                {"first merge", TranscodedBatch(a.Path())},
                                {"first merge of B", TranscodedBatch(b.Path())},
                                {"next merge", TranscodedBatch(a.Path()), true},
                                {"re-merge", Purged(a.Path())},
                                {"removal", Unplugged(b.Path())}};

private:
  /// The last log line of a phase, and the name of the next phase.
  const std::vector<std::pair<std::string, std::string>> PHASES{
      {"Retrieved counts", ", folders"}, {" folders for", ", files"}, {" files for", ", commit"}};
};

TEST_F(Kill, AtAnyInstantLosesNothingThatTheNextRunDoesNotRestore) {
  constexpr unsigned SEED = 471108;
  const int rounds = TestScale(1, 20);

  Record();
  ASSERT_EQ(PHASES_OF_A_RUN, Phases());
  const auto [merged, end] = RunAgain();
  EXPECT_THAT(Difference(merged, end), IsEmpty());
  EXPECT_THAT(merged, Contains("/shares/A/|1185|1185|2001"));
  EXPECT_THAT(merged, Contains("/shares/B/|285|285|2001"));

  std::mt19937 random(SEED);
  for (int round = 0; round < rounds; ++round) {
    for (const auto& [phase, all] : instants) {
      const Instant& instant = all[random() % all.size()];
      SCOPED_TRACE("seed " + std::to_string(SEED) + ", round " + std::to_string(round) +
                   ", killed before effect " + std::to_string(instant.effect) + " of " +
                   std::to_string(all.size()) + " in: " + phase);
      RunUntil(instant);
      const auto [mergedAfter, endAfter] = RunAgain();
      ASSERT_THAT(Difference(merged, mergedAfter), IsEmpty());
      ASSERT_THAT(Difference(merged, endAfter), IsEmpty());
    }
  }
  ReportFigure("kills of the daemon at random instants",
               std::to_string(rounds * static_cast<int>(instants.size())));
}

} // namespace
} // namespace orva::test
