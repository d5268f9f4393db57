#include "Catalog.h"
#include "Expectations.h"
#include "Messages.h"

#include <sys/mount.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;
using ::testing::StartsWith;

const std::string DIRECTORY = "/tmp/daemon"; ///< where the daemon works
const std::string NO_DATABASE = "MessageProcessor:: Invalid DB location : '/shares/B/.zophotos'";

/// An event for volume C, which is neither the old nor the new master.
struct NextEvent {
  const char* name;
  std::string (*compose)(const std::string& mountPoint);
};

const std::vector<NextEvent> NEXT_EVENTS{{"ABatch", TranscodedBatch}, {"AnEnd", End},
                                         {"APurge", Purged},          {"APlugging", Plugged},
                                         {"AScan", Scanned},          {"AnUnplugging", Unplugged}};

/// Without this function gtest prints the bytes of the object.
void PrintTo(const NextEvent& event, std::ostream* stream) {
  *stream << event.name;
}

/// The master A has merged volume C. Then A is pulled, and something prevents the change to B, the
/// next master.
class Recovery : public SystemTest {
protected:
  /// Starts the daemon and merges. Its working directory is a small file system.
  void Start() {
    ASSERT_EQ(0, mkdir(DIRECTORY.c_str(), 0777));
    ASSERT_EQ(0, mount("scratch", DIRECTORY.c_str(), "tmpfs", 0, "size=256k"));
    Catalog(a).AddPhoto("a.jpg", 1000, 2000);
    Catalog(c).AddPhoto("c.jpg", 1001, 2001);
    appliance.Start();
    appliance.Handle(Plugged(a.Path()));
    appliance.Handle(Plugged(b.Path()));
    appliance.Handle(Plugged(c.Path()));
    appliance.Handle(Scanned(a.Path()));
    appliance.Handle(TranscodedBatch(a.Path()));
    appliance.Handle(TranscodedBatch(c.Path()));
    ASSERT_THAT(MergedDatabase(a.Path()).Files(), SizeIs(2));
  }

  void TearDown() override {
    SystemTest::TearDown();
    umount2(DIRECTORY.c_str(), MNT_DETACH);
  }

  /// Unplugs the master. Returns the error lines.
  Lines PullTheMaster() {
    a.Unmount();
    return ErrorTexts(appliance.Handle(Unplugged(a.Path())));
  }

  /// A file in the place of its directory keeps the database on B from being created.
  static void ObstructB() { std::ofstream("/shares/B/.zophotos") << "no directory"; }
  static void ClearB() { fs::remove("/shares/B/.zophotos"); }

  static void FillWorkingDirectory() {
    std::ofstream(DIRECTORY + "/filler") << std::string(256 << 10U, 'x');
  }

  /// After the next event, the locator names B, and merges into it apply.
  void ExpectRepairedBy(const NextEvent& event) {
    EXPECT_THAT(ErrorTexts(appliance.Handle(event.compose(c.Path()))), IsEmpty());
    ExpectMergesIntoB();
  }

  void ExpectMergesIntoB() {
    EXPECT_EQ(LocatorOn("/shares/B/"), Appliance::Locator());
    EXPECT_THAT(ErrorTexts(appliance.Handle(TranscodedBatch(c.Path()))), IsEmpty());
    {
      const MergedDatabase merged(b.Path());
      EXPECT_THAT(merged.Faults(), IsEmpty());
      EXPECT_THAT(merged.Files(), ElementsAre(rowC));
      EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/C/|1|1|2001"));
    }
    Catalog(b).AddPhoto("b.jpg", 1002, 2002);
    appliance.Handle(Purged(b.Path()));
    EXPECT_THAT(MergedDatabase(b.Path()).Files(),
                ElementsAre("/shares/B/b.jpg|1002|1002|/shares/B/", rowC));
    EXPECT_EQ(LocatorOn("/shares/B/"), Appliance::Locator());
  }

  Volume a{"A", "150g"};
  Volume b{"B", "120g"};
  Volume c{"C", "1g"};
  const std::string rowC = "/shares/C/c.jpg|1001|1001|/shares/C/";
};

TEST_F(Recovery, FromALockOnTheNextMaster) {
  Start();
  fs::copy(a.Path() + "/.zophotos", b.Path() + "/.zophotos");
  const auto locked = AllOf(StartsWith("MessageProcessor:: "), HasSubstr("database is locked"));
  {
    const MergedDatabase other(b.Path());
    other.Rows().Run("BEGIN EXCLUSIVE");
    EXPECT_THAT(PullTheMaster(), ElementsAre(locked));
    EXPECT_THAT(ErrorTexts(appliance.Handle(Purged(c.Path()))), ElementsAre(locked));
    other.Rows().Run("COMMIT");
  }
  EXPECT_THAT(ErrorTexts(appliance.Handle(Purged(c.Path()))), IsEmpty());
  EXPECT_EQ(LocatorOn("/shares/B/"), Appliance::Locator());
  EXPECT_THAT(MergedDatabase(b.Path()).Files(),
              ElementsAre("/shares/A/a.jpg|1000|1000|/shares/A/", rowC));
}

TEST_F(SystemTest, RecoversFromAFailedFallback) {
  fs::remove("/shares"); // so that the shares root is no candidate
  appliance.Start();
  Volume a("A", "150g");
  const Volume c("C", "100m");
  Catalog(c).AddPhoto("c.jpg", 1001, 2001);
  appliance.Handle(Plugged(a.Path()));
  appliance.Handle(Plugged(c.Path()));
  appliance.Handle(Scanned(a.Path()));
  std::ofstream("/shares/.zophotos") << "no directory";
  a.Unmount();
  const auto failed = ElementsAre("/shares/C/  ---------  is not a candidate \n",
                                  "MessageProcessor:: Invalid DB location : '/shares/.zophotos'");
  EXPECT_THAT(ErrorTexts(appliance.Handle(Unplugged(a.Path()))), failed);
  EXPECT_THAT(ErrorTexts(appliance.Handle(TranscodedBatch(c.Path()))), failed);

  fs::remove("/shares/.zophotos");
  // The fallback makes the shares root a candidate, and the batch begins the merges.
  appliance.Handle(TranscodedBatch(c.Path()));
  EXPECT_EQ(LocatorOn("/shares"), Appliance::Locator());
  EXPECT_THAT(ErrorTexts(appliance.Handle(TranscodedBatch(c.Path()))), IsEmpty());
  EXPECT_THAT(MergedDatabase("/shares").Files(),
              ElementsAre("/shares/C/c.jpg|1001|1001|/shares/C/"));
}

class RecoveryBy : public Recovery, public ::testing::WithParamInterface<NextEvent> {};

TEST_P(RecoveryBy, AfterAFailedTransition) {
  Start();
  ObstructB();
  EXPECT_THAT(PullTheMaster(), ElementsAre(NO_DATABASE));
  ClearB();
  ExpectRepairedBy(GetParam());
}

TEST_P(RecoveryBy, AfterASecondFailure) {
  Start();
  ObstructB();
  EXPECT_THAT(PullTheMaster(), ElementsAre(NO_DATABASE));
  EXPECT_THAT(ErrorTexts(appliance.Handle(GetParam().compose(c.Path()))), ElementsAre(NO_DATABASE));
  ClearB();
  ExpectRepairedBy(GetParam());
}

TEST_P(RecoveryBy, AfterAFailedRemoval) {
  Start();
  FillWorkingDirectory();
  EXPECT_THAT(PullTheMaster(), ElementsAre(StartsWith("MessageProcessor:: ")));
  // The election did not wait for the next event.
  EXPECT_EQ(LocatorOn("/shares/B/"), Appliance::Locator());
  ExpectRepairedBy(GetParam());
}

TEST_P(RecoveryBy, AfterAFailedRemovalAndAFailedTransition) {
  Start();
  FillWorkingDirectory();
  ObstructB();
  EXPECT_THAT(PullTheMaster(), ElementsAre(NO_DATABASE, StartsWith("MessageProcessor:: ")));
  ClearB();
  ExpectRepairedBy(GetParam());
}

INSTANTIATE_TEST_SUITE_P(At, RecoveryBy, ::testing::ValuesIn(NEXT_EVENTS),
                         [](const auto& tested) { return tested.param.name; });

} // namespace
} // namespace orva::test
