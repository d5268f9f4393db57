// The running daemon with hostile volumes: it continues to serve the other volumes.

#include "Catalog.h"
#include "CraftedDatabase.h"
#include "CraftedLog.h"
#include "Expectations.h"
#include "Messages.h"
#include "SpecialFile.h"

#include "orvautil/Core.h"

#include <filesystem>
#include <fstream>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::IsEmpty;
using ::testing::StartsWith;

const std::string PRECIOUS = "/tmp/victim";

Log ErrorLines(const Log& log) {
  Log errors;
  for (const LogLine& line : log) {
    if (line.priority == Error("").priority) {
      errors.push_back(line);
    }
  }
  return errors;
}

/// A daemon with two volumes, of which the first is the largest and hostile.
class HostileSystem : public SystemTest {
protected:
  HostileSystem() {
    std::ofstream(PRECIOUS) << "precious content";
    photos.AddPhoto("a.jpg", 1000, 2000);
  }

  /// Adds a photo to the good volume and expects that it is merged into the master.
  void ExpectGoodMergeInto(const Volume& master) {
    const std::string name = std::to_string(++photos_) + ".jpg";
    photos.AddPhoto(name, 1, 2000 + photos_);
    const Log log = appliance.Handle(TranscodedBatch(good.Path()));
    EXPECT_THAT(ErrorLines(log), IsEmpty());
    EXPECT_THAT(MergedDatabase(master.Path()).Files(),
                ::testing::Contains("/shares/Good/" + name + "|1|1|/shares/Good/"));
  }

  Volume hostile{"Hostile", "200g"};
  Volume good{"Good", "150g"};
  Catalog photos{good};

private:
  int photos_ = 0;
};

TEST_F(HostileSystem, ContinuesAfterHostileCatalogs) {
  appliance.Start();
  appliance.Handle(Plugged(good.Path()));
  appliance.Handle(Scanned(good.Path()));
  appliance.Handle(Plugged(hostile.Path()));
  const std::string home = core::GetORVA_HOME(hostile.Path());
  const std::string catalog = core::GetCatalogPath(hostile.Path());
  const auto expectRefused = [&](const std::string& message) {
    const Log errors = ErrorLines(appliance.Handle(message));
    ASSERT_EQ(1U, errors.size()) << ::testing::PrintToString(errors);
    EXPECT_THAT(errors[0].text, StartsWith("Error that we will ignore "));
    ExpectGoodMergeInto(good);
  };

  for (const SpecialKind kind : SPECIAL_KINDS) {
    SCOPED_TRACE(NameOf(kind));
    fs::create_directory(home);
    const SpecialFile special(kind, catalog, PRECIOUS);
    expectRefused(TranscodedBatch(hostile.Path()));
    expectRefused(Purged(hostile.Path()));
  }
  {
    Catalog endless(hostile);
    endless.AddFolder("a/", 1);
  }
  CraftedDatabase crafted(catalog);
  crafted.Multiply(2, 12); // the first table made
  crafted.Save();
  expectRefused(TranscodedBatch(hostile.Path()));
  expectRefused(Purged(hostile.Path()));
}

/// The hostile volume has a merged database and becomes the master.
class HostileMaster : public HostileSystem {
protected:
  HostileMaster() { fs::create_directory(folder); }

  /// Lets the daemon elect the hostile volume, unplugs that, and expects that the other volume is
  /// served.
  void ExpectTheNextMasterToWork() {
    appliance.Start();
    appliance.Handle(Plugged(hostile.Path()));
    appliance.Handle(Plugged(good.Path()));
    const Log errors = ErrorLines(appliance.Handle(Scanned(hostile.Path())));
    ASSERT_EQ(1U, errors.size()) << ::testing::PrintToString(errors);
    EXPECT_THAT(errors[0].text, StartsWith("MessageProcessor:: "));

    appliance.Handle(Unplugged(hostile.Path()));
    ExpectGoodMergeInto(good);
    EXPECT_EQ("zophotos_db_path=/shares/Good//.zophotos/zophotos.db\n", Appliance::Locator());
    EXPECT_TRUE(fs::exists(PRECIOUS));
    EXPECT_FALSE(fs::exists("/tmp/zophotos.db"));
  }

  const std::string folder = hostile.Path() + "/.zophotos";
  const std::string database = folder + "/zophotos.db";
};

TEST_F(HostileMaster, WithGarbageDoesNotHarmTheNextMaster) {
  std::ofstream(database) << std::string(4096, 'x');
  ExpectTheNextMasterToWork();
}

TEST_F(HostileMaster, WithAJournalThatNamesAFileDoesNotHarmTheNextMaster) {
  std::ofstream(database).flush();
  CraftedJournal(4096, 1, {}, PRECIOUS).Save(database + "-journal");
  ExpectTheNextMasterToWork();
}

TEST_F(HostileMaster, WithALinkAsItsFolderDoesNotHarmTheNextMaster) {
  fs::remove(folder);
  fs::create_directory_symlink("/tmp", folder);
  ExpectTheNextMasterToWork();
}

} // namespace
} // namespace orva::test
