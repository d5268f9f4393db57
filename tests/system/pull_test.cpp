#include "Catalog.h"
#include "Expectations.h"
#include "Messages.h"
#include "Tracer.h"

#include "support/TestScale.h"

#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/syscall.h>

#include <algorithm>
#include <filesystem>

namespace orva::test {
namespace {

using ::testing::AnyOf;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::IsEmpty;
using ::testing::SizeIs;
using ::testing::StartsWith;

/// The distance between two instants of a merge at which a volume is pulled.
const int STRIDE = TestScale(6, 1);

/// A daemon whose volumes are pulled while it merges.
class Pull : public ::testing::Test {
protected:
  /// Runs a merge of B. Calls `pull` before its effect number `instant` on files or the log; false
  /// when there are fewer effects.
  static bool MergeAndPull(Appliance& appliance, int instant, const std::function<void()>& pull) {
    {
      Tracer tracer(appliance.Daemon().Pid());
      appliance.Service().Send(TranscodedBatch("/shares/B"));
      const std::string last = appliance.SendBarrier();
      int effect = 0;
      bool ended = false;
      tracer.RunUntil([&](const SystemCall& call) {
        if (!IsEffect(call) || call.number == SYS_write) {
          return false;
        }
        ended = tracer.Data(call).find(last) != std::string::npos;
        return ended || effect++ == instant;
      });
      if (ended) {
        return false;
      }
      pull();
    }
    appliance.Barrier();
    return true;
  }

  static void FillB(const Volume& b) {
    Catalog catalog(b);
    catalog.AddFolder("Pictures/", 600);
    catalog.AddPhotos("Pictures/", 1000, 2000);
  }

  static void FillA(const Volume& a) {
    Catalog catalog(a);
    catalog.AddFolder("Pictures/", 500);
    catalog.AddPhotos("Pictures/", 100, 1000);
  }
};

TEST_F(Pull, OfTheMergedVolumeLosesAtMostItsMerge) {
  Appliance appliance;
  appliance.Start();
  const Volume a("A", "150g");
  FillA(a);
  appliance.Handle(Plugged(a.Path()));
  appliance.Handle(Scanned(a.Path()));
  appliance.Handle(TranscodedBatch(a.Path()));
  int merged = 0;
  int failed = 0;
  for (bool pulled = true; pulled;) {
    const int instant = (merged + failed) * STRIDE;
    SCOPED_TRACE("pulled at instant " + std::to_string(instant));
    Volume b("B", "1g");
    FillB(b);
    appliance.Handle(Plugged(b.Path()));
    pulled = MergeAndPull(appliance, instant, [&] { b.Unmount(); });
    const Lines errors = ErrorTexts(appliance.TakeLog());
    ++(errors.empty() ? merged : failed);
    if (!errors.empty()) {
      EXPECT_THAT(errors.back(), EndsWith("there is no volume at '/shares/B/'\n"));
      EXPECT_THAT(Lines(errors.begin(), errors.end() - 1),
                  Each("There is no filesystem location for the mountpoint /shares/B/"));
    }
    EXPECT_THAT(MergedDatabase(a.Path()).Faults(), IsEmpty());
    EXPECT_THAT(MergedDatabase(a.Path()).Files(), SizeIs(errors.empty() ? 1100 : 100));

    b.Unmount();
    appliance.Handle(Unplugged(b.Path()));
    EXPECT_THAT(MergedDatabase(a.Path()).Files(), SizeIs(100));
    EXPECT_THAT(PathsBelow("/shares/A/.zophotos"), SizeIs(1));
  }
  EXPECT_GT(merged, 2);
  EXPECT_GT(failed, 0);
  EXPECT_EQ(Exited(0), appliance.Shutdown());
  ReportFigure("instants of a merge at which its volume was pulled",
               std::to_string(merged + failed - 1));
}

/// A second mount of a volume, which stays when the volume is pulled.
class Kept {
public:
  explicit Kept(const Volume& volume) {
    mkdir(PATH, 0755);
    mount(volume.Path().c_str(), PATH, nullptr, MS_BIND, nullptr);
  }
  Kept(const Kept&) = delete;
  Kept& operator=(const Kept&) = delete;
  ~Kept() { umount2(PATH, MNT_DETACH); }

  /// Mounts the volume at its old mount point.
  static void Return(const std::string& path) {
    mkdir(path.c_str(), 0755);
    mount(PATH, path.c_str(), nullptr, MS_BIND, nullptr);
  }

  static constexpr const char* PATH = "/tmp/kept";
};

/// Starts the daemon and plugs both volumes, with A as the master.
void Begin(Appliance& appliance) {
  appliance.Start();
  for (const char* const message : {"/shares/A", "/shares/B"}) {
    appliance.Handle(Plugged(message));
  }
  appliance.Handle(Scanned("/shares/A"));
  EXPECT_EQ("zophotos_db_path=/shares/A//.zophotos/zophotos.db\n", Appliance::Locator());
}

class PullOfTheMaster : public Pull {
protected:
  /// Pulls A at an instant of the merge of B and checks its database afterwards; false when the
  /// merge had fewer instants.
  bool PullAt(int instant) {
    for (const char* const place : {"/shares/.zophotos", "/tmp/daemon"}) {
      std::filesystem::remove_all(place);
    }
    Volume a("A", "150g");
    const Volume b("B", "1g");
    FillA(a);
    FillB(b);
    const Kept kept(a);
    bool pulled = false;
    {
      Appliance appliance;
      Begin(appliance);
      appliance.Handle(TranscodedBatch(a.Path()));
      pulled = MergeAndPull(appliance, instant, [&] { a.Unmount(); });
      ExpectAllOrNothing(ErrorTexts(appliance.TakeLog()), pulled);
      ExpectSharesRootTakesOver(appliance);
      EXPECT_EQ(Exited(0), appliance.Shutdown());
    }
    if (pulled) {
      Kept::Return(a.Path());
      ExpectReturn();
      umount2(a.Path().c_str(), MNT_DETACH);
      std::filesystem::remove(a.Path());
    }
    return pulled;
  }

private:
  /// A merge into a volume that is gone mostly fails: the next program that opens the database
  /// rolls it back. At the end it may still commit, because it has the files open.
  void ExpectAllOrNothing(const Lines& errors, bool pulled) {
    const MergedDatabase merged(Kept::PATH);
    EXPECT_THAT(merged.Faults(), IsEmpty());
    EXPECT_THAT(merged.Files(), AnyOf(SizeIs(100), SizeIs(1100)));
    if (!pulled) {
      EXPECT_THAT(merged.Files(), SizeIs(1100));
    }
    if (!errors.empty()) {
      EXPECT_THAT(merged.Files(), SizeIs(100));
      EXPECT_THAT(errors.back(), StartsWith("Error that we will ignore "));
      EXPECT_THAT(Lines(errors.begin(), errors.end() - 1),
                  Each("Could not insert stats for /shares/B/ "));
    }
    failures += errors.empty() ? 0 : 1;
  }

  static void ExpectSharesRootTakesOver(Appliance& appliance) {
    appliance.Handle(Unplugged("/shares/A"));
    EXPECT_EQ("zophotos_db_path=/shares/.zophotos/zophotos.db\n", Appliance::Locator());
    EXPECT_THAT(ErrorTexts(appliance.Handle(TranscodedBatch("/shares/B"))), IsEmpty());
    EXPECT_THAT(MergedDatabase("/shares").Files(), SizeIs(1000));
  }

  /// The volume is plugged again, and is the master of a new daemon.
  static void ExpectReturn() {
    Appliance appliance;
    Begin(appliance);
    EXPECT_THAT(ErrorTexts(appliance.Handle(TranscodedBatch("/shares/B"))), IsEmpty());
    const MergedDatabase merged("/shares/A");
    EXPECT_THAT(merged.Faults(), IsEmpty());
    EXPECT_THAT(merged.Files(), SizeIs(1100));
    EXPECT_THAT(merged.Statistics(),
                ElementsAre("/shares/A/|100|100|1000", "/shares/B/|1000|1000|2000"));
    EXPECT_THAT(PathsBelow("/shares/A/.zophotos"), SizeIs(1));
    EXPECT_EQ(Exited(0), appliance.Shutdown());
  }

protected:
  int failures = 0; ///< merges that have logged their failure
};

TEST_F(PullOfTheMaster, LosesNothingFromItsDatabase) {
  int instant = 0;
  for (bool pulled = true; pulled; instant += pulled ? STRIDE : 0) {
    SCOPED_TRACE("pulled at instant " + std::to_string(instant));
    pulled = PullAt(instant);
  }
  EXPECT_GT(failures, 2);
  ReportFigure("instants of a merge at which the master was pulled",
               std::to_string(instant / STRIDE));
}

} // namespace
} // namespace orva::test
