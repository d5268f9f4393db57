// Catalogs whose file is hostile: special, truncated or randomly changed files, and crafted
// journals and logs.

#include "HostileTest.h"
#include "SpecialFile.h"

#include "support/OtherUsers.h"

#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <random>

namespace orva::test {
namespace {

namespace fs = std::filesystem;

class CatalogFileTest : public HostileTest {
protected:
  /// Makes a good catalog on the hostile volume, in pages of this size.
  static void MakeCatalog(const std::string& volume = VOLUME, int pageSize = 4096) {
    Catalog catalog(volume);
    AddPhotos(catalog);
    catalog.Rows().Run("PRAGMA page_size = " + std::to_string(pageSize));
    catalog.Rows().Run("VACUUM");
  }

  static void SetWalMode() { Database(CATALOG).Run("PRAGMA journal_mode = WAL"); }

  static void Write(const std::string& path, const std::string& content) {
    std::ofstream(path, std::ios::binary) << content;
  }

  static Bytes Page(std::uint32_t number) {
    const CraftedDatabase catalog(CATALOG);
    return Bytes::Of(CATALOG).Part(catalog.Offset(number), catalog.PageSize());
  }
};

class SpecialCatalogTest : public CatalogFileTest,
                           public ::testing::WithParamInterface<SpecialKind> {};

TEST_P(SpecialCatalogTest, CatalogThatIsNotARegularFileIsRefused) {
  MakeCatalog(DECOY);
  MakeCatalogFolder();
  const SpecialFile special(GetParam(), CATALOG, DECOY + ".orva/orva.db");
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_P(SpecialCatalogTest, CatalogFolderThatIsNotAFolderIsRefused) {
  MakeCatalog(DECOY);
  const SpecialFile special(GetParam(), core::GetORVA_HOME(VOLUME), DECOY + ".orva");
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_P(SpecialCatalogTest, LogThatIsNotARegularFileIsRefused) {
  MakeCatalog();
  SetWalMode();
  catalogHasWal = true;
  for (const char* const suffix : {"-wal", "-shm"}) {
    SCOPED_TRACE(suffix);
    const SpecialFile special(GetParam(), CATALOG + suffix, VICTIM);
    EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
  }
  // There is no journal, in this mode or behind a link to nothing.
  const SpecialFile special(GetParam(), CATALOG + "-journal", VICTIM);
  EXPECT_NE(Outcome::Broken, MergeHostileVolume());
}

INSTANTIATE_TEST_SUITE_P(Kinds, SpecialCatalogTest, ::testing::ValuesIn(SPECIAL_KINDS),
                         [](const auto& tested) { return NameOf(tested.param); });

// Hard links, which a program that may write only here can make.
TEST_F(CatalogFileTest, HardLinkAsTheSharedMemoryChangesNoOtherFile) {
  MakeCatalog();
  SetWalMode();
  fs::create_hard_link(VICTIM, CATALOG + "-shm");
  catalogHasWal = true;
  EXPECT_NE(Outcome::Broken, MergeHostileVolume());
}

TEST_F(CatalogFileTest, HardLinkAsTheJournalChangesNoOtherFile) {
  SKIP_WITHOUT_OTHER_USERS();
  MakeCatalog();
  fs::create_hard_link(VICTIM, CATALOG + "-journal");
  EXPECT_EQ(0, chown(CATALOG.c_str(), 1, 1));
  EXPECT_NE(Outcome::Broken, MergeHostileVolume());
}

TEST_F(CatalogFileTest, HardLinkAsTheLogChangesNoOtherFile) {
  MakeCatalog();
  SetWalMode();
  fs::create_hard_link(VICTIM, CATALOG + "-wal");
  catalogHasWal = true;
  EXPECT_NE(Outcome::Broken, MergeHostileVolume());
}

TEST_F(CatalogFileTest, FilesThatAreNotDatabasesAreRefused) {
  MakeCatalogFolder();
  for (const std::string& content :
       {std::string("what is this"), std::string(100'000, 'x'), std::string(100'000, '\0'),
        std::string("SQLite format 3\0", 16),
        std::string("SQLite format 3\0", 16) + std::string(4080, '\0')}) {
    SCOPED_TRACE(content.size());
    Write(CATALOG, content);
    EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
  }
}

TEST_F(CatalogFileTest, JournalOfAnEmptyFileIsNotPlayedBack) {
  MakeCatalog();
  const Bytes page = Page(1);
  Write(CATALOG, "");
  for (const std::string& super : {std::string(), VICTIM, std::string("/tmp/victim")}) {
    CraftedJournal(4096, 1, {{1, page}}, super).Save(CATALOG + "-journal");
    EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
  }
}

TEST_F(CatalogFileTest, HotJournalIsNotPlayedBack) {
  MakeCatalog();
  const Bytes page = Page(1);
  for (const std::string& super : {std::string(), VICTIM, std::string("/tmp/victim")}) {
    for (const std::uint32_t pages : {1U, 0x7fffffffU}) {
      CraftedJournal(4096, pages, {{1, page}}, super).Save(CATALOG + "-journal");
      EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
    }
  }
}

TEST_F(CatalogFileTest, GarbageLogIsIgnored) {
  MakeCatalog();
  SetWalMode();
  catalogHasWal = true;
  for (const std::string& content :
       {std::string(1, 'x'), std::string(32, '\x37'), std::string(1'000'000, '\x37')}) {
    Write(CATALOG + "-wal", content);
    EXPECT_EQ(Outcome::Merged, MergeHostileVolume());
  }
  Write(CATALOG + "-wal", "");
  for (const std::size_t size : {1U, 32768U, 1'000'000U}) {
    Write(CATALOG + "-shm", std::string(size, '\x37'));
    EXPECT_EQ(Outcome::Merged, MergeHostileVolume());
  }
}

TEST_F(CatalogFileTest, LogThatClaimsAHugeDatabaseIsRead) {
  MakeCatalog();
  SetWalMode();
  catalogHasWal = true;
  Bytes page = Page(1);
  page.Write(28, 4, 0x7fffffff);
  CraftedWal(4096, 0x7fffffff, {{1, page}}).Save(CATALOG + "-wal");
  EXPECT_EQ(Outcome::Merged, MergeHostileVolume());
}

TEST_F(CatalogFileTest, TruncatedCatalogsAreMergedOrRefused) {
  constexpr std::size_t pageSize = 512;
  MakeCatalog(VOLUME, pageSize);
  const Bytes whole = Bytes::Of(CATALOG);
  for (std::size_t size = 0; size < whole.Size(); size += pageSize) {
    for (const std::size_t more : {0U, 1U, 99U, 511U}) {
      SCOPED_TRACE(size + more);
      whole.Part(0, size + more).Save(CATALOG);
      EXPECT_NE(Outcome::Broken, MergeHostileVolume());
    }
  }
}

TEST_F(CatalogFileTest, RandomlyChangedCatalogsAreMergedOrRefused) {
  constexpr std::size_t pageSize = 512;
  const unsigned mutants = TestScale(200U, 20'000U);
  MakeCatalog(VOLUME, pageSize);
  const Bytes whole = Bytes::Of(CATALOG);
  unsigned merged = 0;
  for (unsigned seed = 0; seed < mutants && !HasFailure(); ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    std::mt19937 random(seed);
    Bytes mutant = whole;
    Mutate(mutant, pageSize, random);
    mutant.Save(CATALOG);
    catalogHasWal = mutant.Read(18, 1) == 2 && mutant.Read(19, 1) == 2;
    merged += MergeHostileVolume() == Outcome::Merged ? 1 : 0;
    fs::remove(CATALOG + "-shm");
    fs::remove(CATALOG + "-wal");
  }
  // If all mutants were refused, or all merged, the changes would test too little.
  EXPECT_LT(0U, merged);
  EXPECT_GT(mutants, merged);
  ReportFigure("mutants of a catalog merged, of them readable",
               std::to_string(mutants) + ", " + std::to_string(merged));
}

} // namespace
} // namespace orva::test
