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

/// What a step of a life tells the daemon; the start of the daemon is a step as well.
struct Step {
  std::string name;
  std::string message; ///< empty for the start
  bool followsChanges = false;
};

/// What a kill can hit; the phases of a merge are those that its log lines tell apart.
const Lines PHASES_OF_A_LIFE{"first merge",
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

/// An instant at which a kill makes a difference: before the effect of this number in a step.
struct Instant {
  Step step;
  bool old; ///< whether there is a database of an earlier life under the shares root
  std::size_t effect;
};

/// What a life has left that a daemon or another program can see.
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

/// The lines that only one of two lists has.
Lines Difference(Lines expected, Lines actual) {
  std::sort(expected.begin(), expected.end());
  std::sort(actual.begin(), actual.end());
  Lines difference;
  std::set_symmetric_difference(expected.begin(), expected.end(), actual.begin(), actual.end(),
                                std::back_inserter(difference));
  return difference;
}

/// Nothing went wrong in a life.
void ExpectNoErrors(Appliance& appliance) {
  for (const LogLine& line : appliance.TakeLog()) {
    EXPECT_NE(Error("").priority, line.priority) << line.text;
  }
}

/// What is on the volumes and who is told of it, from the first start of a daemon to the removal
/// of a volume; the same for each life. The daemon of a life may be killed, and another one then
/// goes through all of it again.
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

  /// New folders, a folder that grows, folders that go with their photos, and single ones that go.
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

  /// An appliance on which no daemon has ever run; with `old` one ran long ago, when there was no
  /// volume to be the master.
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

  /// Runs a step with a traced daemon. Before each effect `holds` is asked with the phase.
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
      // A merger's own thread tells of the volumes at any time.
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

  /// Lives once through all steps, and the start a second time over what was left, and notes the
  /// instants.
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

  /// The life of a daemon that is killed.
  void LiveUntil(const Instant& instant) const {
    const auto appliance = NewAppliance(instant.old);
    for (auto step = steps.begin(); !instant.old && step->name != instant.step.name; ++step) {
      RunStep(*appliance, *step);
    }
    std::size_t effect = 0;
    Trace(*appliance, instant.step,
          [&](const std::string& /*phase*/) { return effect++ == instant.effect; });
    // A daemon that had fewer effects this time is still there.
    kill(appliance->Daemon().Pid(), SIGKILL);
    EXPECT_EQ(Killed(SIGKILL), appliance->Daemon().AwaitEnd());
  }

  /// The life of a daemon that finds whatever an earlier one has left. Returns what is there when
  /// each volume has been merged, and at the end.
  std::pair<Lines, Lines> LiveAgain() const {
    ShowCatalogs("after");
    Appliance appliance;
    appliance.Start();
    for (std::size_t i = 1; i <= 5; ++i) {
      appliance.Handle(steps[i].message);
    }
    std::pair<Lines, Lines> seen{Observe(), {}};
    for (const std::size_t i : {6, 7, 8, 2, 5}) {
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
  /// What is logged last in a phase, and the phase behind it.
  const std::vector<std::pair<std::string, std::string>> PHASES{
      {"Retrieved counts", ", folders"}, {" folders for", ", files"}, {" files for", ", commit"}};
};

TEST_F(Kill, AtAnyInstantLosesNothingThatTheNextLifeDoesNotBringBack) {
  constexpr unsigned SEED = 471108;
  const int rounds = TestScale(1, 20);

  Record();
  ASSERT_EQ(PHASES_OF_A_LIFE, Phases());
  const auto [merged, end] = LiveAgain();
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
      LiveUntil(instant);
      const auto [mergedAfter, endAfter] = LiveAgain();
      ASSERT_THAT(Difference(merged, mergedAfter), IsEmpty());
      ASSERT_THAT(Difference(merged, endAfter), IsEmpty());
    }
  }
  ReportFigure("kills of the daemon at random instants",
               std::to_string(rounds * static_cast<int>(instants.size())));
}

} // namespace
} // namespace orva::test
