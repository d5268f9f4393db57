#include "Content.h"
#include "Disk.h"
#include "KnownLines.h"
#include "Model.h"
#include "Random.h"
#include "Vitals.h"

#include "Appliance.h"
#include "Expectations.h"
#include "Messages.h"
#include "support/Programs.h"
#include "support/TestScale.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <iostream>
#include <iterator>
#include <numeric>
#include <optional>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using notify::Event;

/// The main thread and the listener; the thread sanitizer has one of its own.
std::size_t ExpectedThreads() {
  return ProgramSanitizer() == Sanitizer::Thread ? 3 : 2;
}

/// The event after which the daemon's memory and descriptors must not grow.
constexpr std::size_t SETTLED = 100;
/// Stacks of ended threads that the C library keeps for new threads.
constexpr long CACHED_STACKS = 5;
/// Bytes for differences between the two measurements: the registered volumes, the previous state,
/// the longest line printed.
constexpr long HEAP_SLACK = 8192;
/// Bytes for free memory that the allocator keeps.
constexpr long RESIDENT_SLACK = 4L * 1024 * 1024;
constexpr std::size_t LONGEST_MESSAGE = 65536;

constexpr std::uint64_t DEFAULT_SEED = 2;

std::uint64_t Seed() {
  const char* const text = std::getenv("ORVA_TEST_SEED");
  return text == nullptr ? DEFAULT_SEED : std::stoull(text);
}

std::vector<std::string> DaemonEnvironment() {
  if (AreProgramsSanitized()) {
    return {};
  }
  // The memory in a thread's cache counts as in use: switch the cache off.
  return {"LD_PRELOAD=" + ProgramPath("libheap_probe.so"), "HEAP_PROBE=" + HEAP_FILE,
          "GLIBC_TUNABLES=glibc.malloc.tcache_count=0"};
}

/// The lines that are only in one of the two.
std::string Difference(const std::vector<std::string>& expected,
                       const std::vector<std::string>& actual) {
  std::vector<std::string> missing;
  std::vector<std::string> surplus;
  std::set_difference(expected.begin(), expected.end(), actual.begin(), actual.end(),
                      std::back_inserter(missing));
  std::set_difference(actual.begin(), actual.end(), expected.begin(), expected.end(),
                      std::back_inserter(surplus));
  std::string text;
  for (const std::string& line : missing) {
    text += "missing: " + line + "\n";
  }
  for (const std::string& line : surplus) {
    text += "surplus: " + line + "\n";
  }
  return text;
}

/// The result of a notification, from its log lines.
Result Observe(const Log& lines) {
  const std::string at = " using master volume at ";
  Result result;
  int merged = 0;
  for (const LogLine& line : lines) {
    const std::size_t master = line.text.find(at);
    if (master != std::string::npos) {
      result.mergedInto = line.text.substr(master + at.size());
    }
    merged +=
        line.text.starts_with("Merged ") && line.text.find(" files for ") != std::string::npos;
    result.gaveUp = result.gaveUp || line.text.starts_with("Error that we will ignore ");
    result.refused = result.refused || line.text.starts_with("MessageProcessor:: ");
  }
  result.merges = result.gaveUp ? 0 : merged;
  return result;
}

/// A run of the daemon with random events. After every event the daemon must answer, and all
/// databases must have the content of the model.
class Endurance : public ::testing::Test {
protected:
  void SetUp() override {
    std::cout << "ORVA_TEST_SEED=" << seed_ << std::endl;
    for (const auto& [name, size] : std::vector<std::pair<std::string, std::string>>{
             {"Archive", "150g"},
             {"Photos", "140g"},
             {"My Pictures & \xc3\x9cnic\xc3\xb6"
              "de",
              "120g"},
             {"Middle", "90g"},
             {"Ten", "10g"},
             {"One", "1g"},
             {"Tiny", "64m"},
         }) {
      auto disk = std::make_unique<Disk>(name, size);
      Change(*disk, 60);
      disks_[disk->MountPoint()] = std::move(disk);
    }
  }

  void TearDown() override {
    if (HasFailure()) {
      constexpr std::size_t shown = 40;
      std::cout << "The last events of the run with ORVA_TEST_SEED=" << seed_ << ":\n";
      for (std::size_t i = history_.size() < shown ? 0 : history_.size() - shown;
           i < history_.size(); ++i) {
        std::cout << history_[i] << "\n";
      }
      std::cout << std::flush;
    }
  }

  struct Kind {
    std::size_t weight;
    void (Endurance::*play)();
  };
  static const std::vector<Kind> KINDS;

  void Start() {
    // The first disk creates the shares root: the daemon does not know it before its fallback, and
    // elects small volumes, too.
    fs::remove("/shares");
    appliance_.emplace();
    appliance_->Start(DaemonEnvironment());
    contents_ = ReadAll();
  }

  void Play(std::size_t event, std::size_t events) {
    isLate_ = event * 3 > events * 2;
    history_.push_back("event " + std::to_string(event));
    if (event == events / 4) {
      UnplugEverything();
    } else if (model_.CurrentState() == Model::State::Default && model_.Master().empty() &&
               !isLate_) {
      PlugLarge();
    } else {
      std::size_t dice = random_.Below(
          std::accumulate(KINDS.begin(), KINDS.end(), std::size_t{0},
                          [](std::size_t sum, const Kind& kind) { return sum + kind.weight; }));
      auto kind = KINDS.begin();
      for (; dice >= kind->weight; ++kind) {
        dice -= kind->weight;
      }
      (this->*kind->play)();
    }
    appliance_->Barrier();
    ASSERT_TRUE(appliance_->IsRunning());
  }

  // The events.

  void Change(Disk& disk, std::size_t times) {
    for (std::size_t i = 0; i < times; ++i) {
      Note("catalog of " + disk.Path() + ": " + disk.Change(random_));
    }
  }

  void ChangeCatalogs() {
    for (const auto& [mountPoint, disk] : disks_) {
      Change(*disk, random_.Below(5));
    }
  }

  void ChangeAndMerge() {
    Disk& disk = UsuallyMounted();
    Change(disk, 1 + random_.Below(10));
    Notify(random_.Chance(85) ? Event::TranscodedBatch : Event::Purged, disk.Path());
  }

  void NotifyOfWork() {
    static const std::vector<Event> EVENTS{Event::TranscodedBatch, Event::TranscodedBatch,
                                           Event::End, Event::Purged, Event::Scanned};
    Notify(random_.Of(EVENTS), UsuallyMounted().Path());
  }

  void NotifyOfTheUnknown() {
    static const std::vector<Event> EVENTS{Event::TranscodedBatch, Event::End,
                                           Event::Purged,          Event::Scanned,
                                           Event::Plugged,         Event::Unplugged};
    Notify(random_.Of(EVENTS), "/shares/Never " + std::to_string(random_.Below(9)));
  }

  void Plug() {
    Disk& disk = AnyDisk();
    if (!disk.IsMounted()) {
      Note("mount " + disk.Path());
      disk.Mount();
    }
    if (random_.Chance(85)) {
      Notify(Event::Plugged, disk.Path());
    }
  }

  void PlugLarge() {
    Disk& disk = *disks_.at("/shares/Photos/");
    if (!disk.IsMounted()) {
      disk.Mount();
    }
    // It may be registered without its size.
    Notify(Event::Unplugged, disk.Path());
    Notify(Event::Plugged, disk.Path());
  }

  void Unplug() { Unplug(AnyDisk()); }

  void Unplug(Disk& disk) {
    if (!MayUnregister(disk)) {
      Notify(Event::TranscodedBatch, disk.Path());
      return;
    }
    if (!disk.IsMounted()) {
      Notify(Event::Unplugged, disk.Path());
      return;
    }
    switch (random_.Below(4)) {
    case 0: // without a notification
      TakeAway(disk);
      disk.Sweep();
      break;
    case 1:
      Notify(Event::Unplugged, disk.Path());
      TakeAway(disk);
      disk.Sweep();
      break;
    case 2:
      TakeAway(disk);
      disk.Sweep();
      Notify(Event::Unplugged, disk.Path());
      break;
    default: // only the notification: the volume stays
      Notify(Event::Unplugged, disk.Path());
      break;
    }
  }

  void UnplugEverything() {
    for (const auto& [mountPoint, disk] : disks_) {
      if (disk->IsMounted() || random_.Chance(50)) {
        Unplug(*disk);
      }
      if (MayUnregister(*disk)) {
        Notify(Event::Unplugged, disk->Path());
      }
    }
  }

  void PullDuringAMerge() {
    Disk& disk = AnyDisk();
    if (!disk.IsMounted() || model_.CurrentState() != Model::State::Scanned) {
      return Unplug(disk);
    }
    Change(disk, 5);
    const bool isMaster = disk.MountPoint() == model_.Master();
    Notify(random_.Chance(50) ? Event::TranscodedBatch : Event::Purged, disk.Path(),
           {.kind = isMaster ? Disturbance::PullOfTheMaster : Disturbance::Pull,
            .during = [&] { TakeAway(disk); }});
    disk.Sweep();
  }

  void PullTheMasterDuringAMerge() {
    const auto master = disks_.find(model_.Master());
    if (master == disks_.end() || !master->second->IsMounted() ||
        model_.CurrentState() != Model::State::Scanned) {
      return Unplug();
    }
    Notify(random_.Chance(50) ? Event::TranscodedBatch : Event::Purged, UsuallyMounted().Path(),
           {.kind = Disturbance::PullOfTheMaster, .during = [&] { TakeAway(*master->second); }});
    master->second->Sweep();
  }

  void ReadForAMoment() { LockMaster(false); }
  void ReadForLong() { LockMaster(true); }

  /// A reader locks the merged database: until a merge waits for it, or for the whole merge.
  void LockMaster(bool long_) {
    if (model_.CurrentState() != Model::State::Scanned ||
        !HasMergedDatabase(model_.MasterLocation())) {
      return NotifyOfWork();
    }
    std::optional<MergedDatabase> reader(model_.MasterLocation());
    reader->Rows().Run("BEGIN");
    reader->Rows().Run("SELECT count(*) FROM Folders");
    Disk& disk = UsuallyMounted();
    Change(disk, 3);
    const std::size_t seen = appliance_->Log().Lines().size();
    const auto isAnnounced = [seen](const Log& lines) {
      return std::any_of(lines.begin() + static_cast<std::ptrdiff_t>(seen), lines.end(),
                         [](const LogLine& line) {
                           return line.text.find(", doing merge for ") != std::string::npos;
                         });
    };
    const auto release = [&] {
      if (!long_) {
        EXPECT_TRUE(appliance_->Log().Await(isAnnounced));
        reader.reset();
      }
    };
    Notify(random_.Chance(70) ? Event::TranscodedBatch : Event::Purged, disk.Path(),
           {.kind = Disturbance::Lock, .during = release});
  }

  void DropTheConnection() {
    const std::string message = TranscodedBatch(AnyDisk().Path());
    if (random_.Chance(50)) {
      Note("a connection that ends within a message");
      appliance_->Service().SendBytes(message.substr(0, random_.Below(message.size())));
    } else {
      Note("a connection that ends");
    }
    appliance_->Service().CloseClient();
    appliance_->Barrier();
    Expect({});
  }

  /// The connection ends after a complete message, which must be handled.
  void SendAndDrop() {
    Notify(Event::TranscodedBatch, AnyDisk().Path(),
           {.during = [&] { appliance_->Service().CloseClient(); }});
  }

  void SendNonsense() {
    const std::string message = Nonsense();
    Note("nonsense of " + std::to_string(message.size()) + " bytes: " + message.substr(0, 60));
    appliance_->Service().Send(message);
    appliance_->Barrier();
    const Result result = Observe(TakeLog());
    EXPECT_EQ("", result.mergedInto);
    ExpectContents(contents_);
  }

  std::string Nonsense() {
    const std::string path = AnyDisk().Path();
    switch (random_.Below(11)) {
    case 0:
      return "<ORVANotification Name=\"Purged\" MountPoint=\"" + path + "\">";
    case 1:
      return Purged(path).substr(0, random_.Below(40)) + "ORVANotification";
    case 2:
      return "<Other text=\"ORVANotification\" Name=\"Purged\" MountPoint=\"/shares/One\"/>";
    case 3:
      return Notification("TranscodedBatch", path, ProfileElement("0123"));
    case 4:
      return Notification("TranscodedBatch", path);
    case 5:
      return Notification("Purged", path, std::string(70'000 + random_.Below(100'000), ' '));
    case 6:
      return Noise();
    case 7:
      return "ORVANotification" + Noise();
    case 8:
      return Notification("Purged", "");
    case 9:
      return "<!DOCTYPE a [<!ENTITY b \"" + path + "\">]>" +
             "<ORVANotification Name=\"Purged\" MountPoint=\"&b;\"/>";
    default:
      return Notification("Formatted", path);
    }
  }

  /// Random bytes without a zero at the end, which would be part of the delimiter.
  std::string Noise() {
    std::string noise(1 + random_.Below(3000), '\0');
    for (char& byte : noise) {
      byte = static_cast<char>(random_.Below(256));
    }
    return noise + "x";
  }

  void ToggleReadOnly() {
    Disk& disk = AnyDisk();
    if (disk.IsMounted()) {
      Note(disk.Path() + (disk.IsReadOnly() ? " becomes writable" : " becomes read only"));
      disk.SetReadOnly(!disk.IsReadOnly());
    }
    Notify(Event::TranscodedBatch, disk.Path());
  }

  void MakeWritable() {
    for (const auto& [mountPoint, disk] : disks_) {
      if (disk->IsReadOnly()) {
        Note(disk->Path() + " becomes writable");
        disk->SetReadOnly(false);
      }
    }
  }

  void BreakCatalog() {
    Disk& disk = AnyDisk();
    Note("broken catalog of " + disk.Path());
    disk.SetCatalogState(
        random_.Chance(30) ? Disk::CatalogState::Absent : Disk::CatalogState::Broken, random_);
    Notify(random_.Chance(70) ? Event::TranscodedBatch : Event::Purged, disk.Path());
  }

  void RepairCatalogs() {
    Note("repaired catalogs");
    for (const auto& [mountPoint, disk] : disks_) {
      disk->SetCatalogState(Disk::CatalogState::Good, random_);
    }
  }

  // The handling of every notification.

  struct Disturbance {
    enum Kind { None, Lock, Pull, PullOfTheMaster };
    Kind kind = None;
    std::function<void()> during = [] {};
  };

  static std::string Name(Event event) {
    static const std::vector<std::string> NAMES{"plugged",          "unplugged", "scanned",
                                                "transcoded batch", "end",       "purged"};
    return NAMES.at(static_cast<std::size_t>(event));
  }

  void Notify(Event event, const std::string& path, const Disturbance& disturbance) {
    Note(Name(event) + " " + path + " (disturbance " + std::to_string(disturbance.kind) + ")");
    appliance_->Service().Send(notify::Compose(event, path));
    disturbance.during();
    appliance_->Barrier();

    const Result result = Observe(TakeLog());
    merges_ += result.merges;
    if (disturbance.kind == Disturbance::PullOfTheMaster) {
      contents_ = ReadAll();
      return;
    }
    // Only the result shows whether the daemon or the disturbance was faster.
    Model::Circumstances circumstances;
    if (disturbance.kind == Disturbance::Lock) {
      circumstances.removalLocked = result.refused;
      circumstances.mergeLocked = result.gaveUp;
    } else if (disturbance.kind == Disturbance::Pull) {
      circumstances.readable = !result.gaveUp;
    }
    Contents expected = contents_;
    EXPECT_EQ(model_.Handle(event, path + "/", expected, circumstances), result);
    Expect(expected);
  }
  void Notify(Event event, const std::string& path) { Notify(event, path, Disturbance()); }

  /// The databases have the expected content, or the same content as before, and the locator is
  /// right.
  void Expect(const std::optional<Contents>& expected) {
    ExpectContents(expected ? *expected : contents_);
    EXPECT_EQ(model_.Locator(), Appliance::Locator());
  }

  void ExpectContents(const Contents& expected) {
    const Contents actual = ReadAll();
    for (const auto& [location, content] : actual) {
      const auto wanted = expected.find(location);
      const Content nothing;
      const Content& should = wanted == expected.end() ? nothing : wanted->second;
      if (content != should) {
        ADD_FAILURE() << "the database at " << location << "\n"
                      << Difference(should.Lines(), content.Lines());
      }
    }
    contents_ = actual;
  }

  // The end of the run.

  /// Repairs everything, purges every mounted volume, and returns the merged content of these
  /// volumes.
  Lines PurgeAll() {
    Note("the end");
    MakeWritable();
    RepairCatalogs();
    for (const auto& [mountPoint, disk] : disks_) {
      if (!disk->IsMounted()) {
        Notify(Event::Unplugged, disk->Path());
      }
    }
    for (const char* const mountPoint : {"/shares/Archive/", "/shares/Ten/", "/shares/Tiny/"}) {
      Disk& disk = *disks_.at(mountPoint);
      if (!disk.IsMounted()) {
        disk.Mount();
      }
      Notify(Event::Plugged, disk.Path());
    }
    Notify(Event::Scanned, "/shares/Archive");
    for (const std::string& mountPoint : Present()) {
      const int before = merges_;
      Notify(Event::Purged, disks_.at(mountPoint)->Path());
      EXPECT_EQ(before + 1, merges_) << mountPoint;
    }
    return contents_.at(model_.MasterLocation()).Lines(Present());
  }

  /// The merged content of the same volumes when a new daemon merges them.
  Lines MergeWithANewDaemon() {
    appliance_.reset();
    for (const std::string& location : Locations()) {
      fs::remove_all(location + "/.zophotos");
    }
    appliance_.emplace();
    appliance_->Start();
    for (const std::string& mountPoint : Present()) {
      appliance_->Handle(Plugged(mountPoint));
    }
    appliance_->Handle(Scanned("/shares/Archive"));
    for (const std::string& mountPoint : Present()) {
      appliance_->Handle(TranscodedBatch(mountPoint));
    }
    const std::string locator = Appliance::Locator();
    const std::size_t begin = locator.find('=') + 1;
    const Content content = Content::At(locator.substr(begin, locator.find("/.zop") - begin));
    EXPECT_EQ(Exited(0), appliance_->Shutdown());
    return content.Lines(Present());
  }

  void ExpectTheSame(const Vitals& early, const Vitals& late) {
    EXPECT_EQ(early.descriptors, late.descriptors);
    EXPECT_LE(late.stacks, early.stacks + CACHED_STACKS);
    if (!AreProgramsSanitized()) {
      EXPECT_LE(late.heap, early.heap + HEAP_SLACK);
      EXPECT_LE(late.resident, early.resident + RESIDENT_SLACK);
    }
  }

  void ExpectKnownLog() {
    const KnownLines known(OPERATIONS_PAGE);
    for (const LogLine& line : appliance_->Log().Lines()) {
      EXPECT_TRUE(known.Contains(line)) << line;
      EXPECT_FALSE(line.text.starts_with("There are too many volumes")) << line;
    }
  }

  void Report(std::size_t events, const Vitals& early, const Vitals& late) const {
    const auto report = [&](const std::string& name, auto early_, auto late_) {
      ReportFigure("endurance: " + name + " after 100 events", std::to_string(early_));
      ReportFigure("endurance: " + name + " at the end", std::to_string(late_));
    };
    ReportFigure("endurance: events", std::to_string(events));
    ReportFigure("endurance: merges", std::to_string(merges_));
    report("open descriptors", early.descriptors.size(), late.descriptors.size());
    if (!AreProgramsSanitized()) {
      report("bytes of heap in use", early.heap, late.heap);
      report("KiB of resident memory", early.resident / 1024, late.resident / 1024);
    }
  }

  // Helpers.

  /// Mount points of the disks that are mounted.
  std::vector<std::string> Present() const {
    std::vector<std::string> present;
    for (const auto& [mountPoint, disk] : disks_) {
      if (disk->IsMounted()) {
        present.push_back(mountPoint);
      }
    }
    return present;
  }

  Disk& AnyDisk() {
    auto disk = disks_.begin();
    std::advance(disk, random_.Below(disks_.size()));
    return *disk->second;
  }

  Disk& UsuallyMounted() {
    const std::vector<std::string> present = Present();
    return present.empty() || random_.Chance(15) ? AnyDisk() : *disks_.at(random_.Of(present));
  }

  /// Once the shares root is the master it stays so: it must not become the master too early.
  bool MayUnregister(const Disk& disk) const {
    return isLate_ || !model_.KeepsTheSharesRootOut(disk.MountPoint());
  }

  void TakeAway(Disk& disk) {
    Note("pull " + disk.Path());
    disk.Unmount();
  }

  void Note(const std::string& text) { history_.push_back("  " + text); }

  Log TakeLog() { return appliance_->TakeLog(); }

  std::vector<std::string> Locations() const {
    std::vector<std::string> locations{"/shares", NO_PLACE};
    for (const auto& [mountPoint, disk] : disks_) {
      locations.push_back(disk->Keeper());
    }
    return locations;
  }

  Contents ReadAll() const {
    Contents contents;
    for (const std::string& location : Locations()) {
      contents[location] = Content::At(location);
    }
    return contents;
  }

  void ExpectSoundDatabases() const {
    for (const std::string& location : Locations()) {
      if (HasMergedDatabase(location)) {
        const MergedDatabase database(location);
        EXPECT_EQ(Lines{"ok"}, database.Rows().Run("PRAGMA integrity_check")) << location;
        EXPECT_EQ(Lines{"0"},
                  database.Rows().Run("SELECT count(*) FROM Files WHERE folder_id NOT IN "
                                      "(SELECT folder_id FROM Folders)"))
            << location;
      }
    }
  }

  /// The resources of the daemon while it waits for messages on a new connection.
  Vitals Measure() {
    // The listener keeps the buffer of the longest message.
    appliance_->Service().Send(std::string(LONGEST_MESSAGE, 'x'));
    appliance_->Barrier();
    appliance_->Service().CloseClient();
    // Before the second barrier the daemon has waited for messages after the first one.
    appliance_->Barrier();
    appliance_->Barrier();
    EXPECT_TRUE(AwaitThreads(appliance_->Daemon().Pid(), ExpectedThreads()));
    return VitalsOf(appliance_->Daemon().Pid());
  }

  std::uint64_t seed_ = Seed();
  Random random_{seed_};
  Disks disks_;
  Model model_{disks_};
  std::optional<Appliance> appliance_;
  Contents contents_; ///< as read last
  std::vector<std::string> history_;
  int merges_ = 0;
  bool isLate_ = false;
};

const std::vector<Endurance::Kind> Endurance::KINDS{
    {6, &Endurance::ChangeCatalogs},
    {45, &Endurance::ChangeAndMerge},
    {8, &Endurance::NotifyOfWork},
    {3, &Endurance::NotifyOfTheUnknown},
    {14, &Endurance::Plug},
    {8, &Endurance::Unplug},
    {1, &Endurance::UnplugEverything},
    {3, &Endurance::PullDuringAMerge},
    {1, &Endurance::PullTheMasterDuringAMerge},
    {3, &Endurance::ReadForAMoment},
    {2, &Endurance::ReadForLong},
    {2, &Endurance::DropTheConnection},
    {2, &Endurance::SendAndDrop},
    {6, &Endurance::SendNonsense},
    {2, &Endurance::ToggleReadOnly},
    {3, &Endurance::MakeWritable},
    {2, &Endurance::BreakCatalog},
    {4, &Endurance::RepairCatalogs},
};

TEST_F(Endurance, TheDaemonSurvivesRandomEvents) {
  Start();
  const auto events = TestScale<std::size_t>(300, 10'000);
  Vitals early;
  for (std::size_t event = 1; event <= events && !HasFailure(); ++event) {
    Play(event, events);
    if (event == SETTLED) {
      early = Measure();
    }
  }
  ASSERT_FALSE(HasFailure());

  EXPECT_GT(merges_ * 10, static_cast<int>(events)); // there were enough merges

  const Lines merged = PurgeAll();
  const Vitals late = Measure();
  ExpectTheSame(early, late);
  ExpectSoundDatabases();
  EXPECT_EQ(Exited(0), appliance_->Shutdown());
  ExpectKnownLog();
  EXPECT_EQ("", Difference(MergeWithANewDaemon(), merged));
  Report(events, early, late);
}

} // namespace
} // namespace orva::test
