// Special files and hard links at the names that the daemon writes to.

#include "HostileTest.h"
#include "SpecialFile.h"

#include <filesystem>
#include <fstream>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::AnyOf;
using ::testing::Contains;
using ::testing::Each;
using ::testing::SizeIs;
using ::testing::StartsWith;

class PlacesTest : public HostileTest, public ::testing::WithParamInterface<SpecialKind> {};

TEST_P(PlacesTest, SpecialFileAsTheMergedDatabaseIsRefused) {
  fs::copy_file(MERGED, DECOY + "other.db");
  const SpecialFile special(GetParam(), MERGED, DECOY + "other.db");
  const auto results = UseHostileMaster();
  ASSERT_THAT(results, SizeIs(7));
  EXPECT_THAT(results[0], StartsWith("Error that we will ignore "));
}

TEST_P(PlacesTest, SpecialFileAsTheJournalIsRefused) {
  const SpecialFile special(GetParam(), MERGED + "-journal", VICTIM);
  const auto results = UseHostileMaster();
  ASSERT_THAT(results, SizeIs(7));
  EXPECT_THAT(results[0], StartsWith("Error that we will ignore "));
}

TEST_P(PlacesTest, SpecialFileAsALogThatIsNotNeededDoesNoHarm) {
  for (const char* const suffix : {"-wal", "-shm"}) {
    SCOPED_TRACE(suffix);
    const SpecialFile special(GetParam(), MERGED + suffix, VICTIM);
    const auto results = UseHostileMaster();
    EXPECT_THAT(results, AnyOf(Each(""), Contains(StartsWith("Error that we will ignore "))));
  }
}

TEST_P(PlacesTest, SpecialFileBesideANewDatabaseChangesNoOtherFile) {
  for (const char* const suffix :
       {"-journal", "-wal", "-shm", ".new", ".new-journal", ".new-wal", ".new-shm"}) {
    SCOPED_TRACE(suffix);
    fs::remove(MERGED);
    const SpecialFile special(GetParam(), MERGED + suffix, VICTIM);
    UseHostileMaster();
  }
}

TEST_P(PlacesTest, SpecialFileAsTheFolderIsRefused) {
  const std::string folder = MASTER + ".zophotos";
  fs::rename(folder, DECOY + "folder");
  const SpecialFile special(GetParam(), folder, DECOY + "folder");
  const auto results = UseHostileMaster();
  if (GetParam() == SpecialKind::Directory) {
    EXPECT_THAT(results, Each(""));
  } else {
    ASSERT_THAT(results, SizeIs(6));
    EXPECT_THAT(results[1], StartsWith("PhotoDB::Error: Invalid DB location"));
  }
}

TEST_P(PlacesTest, SpecialFileAsTheLocatorIsIgnored) {
  const SpecialFile special(GetParam(), LOCATOR_PATH, VICTIM);
  EXPECT_THAT(UseHostileMaster(), Each(""));
}

INSTANTIATE_TEST_SUITE_P(Kinds, PlacesTest, ::testing::ValuesIn(SPECIAL_KINDS),
                         [](const auto& tested) { return NameOf(tested.param); });

TEST_F(HostileTest, HardLinkAsTheLocatorChangesNoOtherFile) {
  fs::create_hard_link("/tmp/victim", LOCATOR_PATH);
  EXPECT_THAT(UseHostileMaster(), Each(""));
}

TEST_F(HostileTest, HardLinkBesideANewDatabaseChangesNoOtherFile) {
  for (const char* const suffix :
       {".new", ".new-journal", ".new-wal", ".new-shm", "-journal", "-wal", "-shm"}) {
    SCOPED_TRACE(suffix);
    fs::remove(MERGED);
    fs::create_hard_link(VICTIM, MERGED + suffix);
    UseHostileMaster();
    fs::remove(MERGED + suffix);
  }
}

} // namespace
} // namespace orva::test
