// Catalogs in which several pages point to the same page: a small file that is read as a huge one.

#include "HostileTest.h"

#include <filesystem>
#include <fstream>

namespace orva::test {
namespace {

class CatalogPagesTest : public HostileTest {
protected:
  CatalogPagesTest() { MakeCatalog(); }

  /// Makes a new catalog with some photos.
  static void MakeCatalog() {
    std::filesystem::remove(CATALOG);
    Catalog catalog(VOLUME);
    AddPhotos(catalog);
  }

  static void Run(const std::string& sql, const Database::Values& values = {}) {
    Database(CATALOG).Run(sql, values);
  }

  /// Repeats the rows of a table, 681 to the power of `levels` times.
  static void Multiply(const std::string& table, unsigned levels) {
    const std::uint32_t root = RootPage(CATALOG, table);
    CraftedDatabase catalog(CATALOG);
    catalog.Multiply(root, levels);
    catalog.Save();
  }
};

TEST_F(CatalogPagesTest, EndlessFoldersAreMergedOrRefused) {
  for (const unsigned levels : {1U, 2U, 4U, 12U}) {
    SCOPED_TRACE(levels);
    MakeCatalog();
    Multiply("Folders", levels);
    EXPECT_NE(Outcome::Broken, MergeHostileVolume());
  }
}

TEST_F(CatalogPagesTest, EndlessHiddenFoldersAreRefused) {
  Run("UPDATE Folders SET isHidden = 1");
  Multiply("Folders", 12);
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_F(CatalogPagesTest, EndlessFilesAreRefused) {
  Multiply("Files", 12);
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

// Files without transcodings are only counted.
TEST_F(CatalogPagesTest, EndlessFilesToCountAreRefused) {
  Run("DELETE FROM Transcodings");
  Multiply("Files", 12);
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_F(CatalogPagesTest, EndlessTranscodingsAreRefused) {
  for (const std::string& profile :
       {std::string(notify::TRANSCODING_PROFILE), std::string("another")}) {
    SCOPED_TRACE(profile);
    Run("UPDATE Transcodings SET profile = ?", {profile});
    Multiply("Transcodings", 12);
    EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
    MakeCatalog();
  }
}

TEST_F(CatalogPagesTest, EndlessTablesAreRefused) {
  Multiply("Folders", 12);
  Multiply("Files", 12);
  Multiply("Transcodings", 12);
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

// A sparse file must not raise the limits.
TEST_F(CatalogPagesTest, EndlessFoldersInASparseFileAreRefused) {
  Multiply("Folders", 12);
  std::filesystem::resize_file(CATALOG, 1ULL << 40U);
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_F(CatalogPagesTest, EndlessHiddenFoldersInASparseFileAreRefused) {
  Run("UPDATE Folders SET isHidden = 1");
  Multiply("Folders", 12);
  std::filesystem::resize_file(CATALOG, 1ULL << 40U);
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_F(CatalogPagesTest, EndlessHiddenFoldersWithASparseLogAreRefused) {
  Run("UPDATE Folders SET isHidden = 1");
  Multiply("Folders", 12);
  for (const char* const suffix : {"-journal", "-wal", "-shm"}) {
    SCOPED_TRACE(suffix);
    std::ofstream(CATALOG + suffix).flush();
    std::filesystem::resize_file(CATALOG + suffix, 1ULL << 40U);
    catalogHasWal = true; // SQLite looks at a log in every mode
    EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
    std::filesystem::remove(CATALOG + suffix);
  }
}

TEST_F(CatalogPagesTest, EndlessHiddenFoldersInTheLogOfASparseFileAreRefused) {
  Run("UPDATE Folders SET isHidden = 1");
  Run("PRAGMA journal_mode = WAL");
  Multiply("Folders", 12);
  catalogHasWal = true;
  CraftedDatabase catalog(CATALOG);
  std::map<std::uint32_t, Bytes> pages;
  for (std::uint32_t page = 1; page <= catalog.Pages(); ++page) {
    pages[page] = catalog.File().Part(catalog.Offset(page), catalog.PageSize());
  }
  CraftedWal(4096, catalog.Pages(), pages).Save(CATALOG + "-wal");
  std::ofstream(CATALOG, std::ios::trunc).flush();
  std::filesystem::resize_file(CATALOG, 1ULL << 40U);
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_F(CatalogPagesTest, EndlessFoldersWithALogThatClaimsAHugeDatabaseAreRefused) {
  Run("UPDATE Folders SET isHidden = 1");
  Multiply("Folders", 12);
  Run("PRAGMA journal_mode = WAL");
  catalogHasWal = true;
  Bytes page = Bytes::Of(CATALOG).Part(0, 4096);
  page.Write(28, 4, 0x7fffffff);
  CraftedWal(4096, 0x7fffffff, {{1, page}}).Save(CATALOG + "-wal");
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

// The schema row of an index without SQL may be repeated.
TEST_F(CatalogPagesTest, EndlessSchemaIsRefused) {
  Run("CREATE TABLE Last(a UNIQUE)");
  CraftedDatabase catalog(CATALOG);
  const std::uint32_t repeated = catalog.CopyOf(1);
  catalog.RepeatCell(repeated, catalog.Cells(repeated) - 1);
  catalog.MultiplyAfter(1, repeated, 12);
  catalog.Save();
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_F(CatalogPagesTest, SchemaThatContainsItselfIsRefused) {
  CraftedDatabase catalog(CATALOG);
  catalog.Multiply(1, 1);
  catalog.SetRightChild(1, 1);
  catalog.Save();
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_F(CatalogPagesTest, TableThatContainsItselfIsRefused) {
  const std::uint32_t root = RootPage(CATALOG, "Folders");
  CraftedDatabase catalog(CATALOG);
  catalog.Multiply(root, 1);
  catalog.SetRightChild(root, root);
  catalog.Save();
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

// One long path in as many rows as fit on a page, which share its overflow pages.
TEST_F(CatalogPagesTest, OneLongPathInAllFoldersIsRefused) {
  for (const unsigned levels : {0U, 1U, 12U}) {
    SCOPED_TRACE(levels);
    std::filesystem::remove(CATALOG);
    Catalog(VOLUME).AddFolder(std::string(900'000, 'x') + "/");
    const std::uint32_t root = RootPage(CATALOG, "Folders");
    CraftedDatabase catalog(CATALOG);
    catalog.RepeatCell(root, 0);
    if (levels > 0) {
      catalog.Multiply(root, levels);
    }
    catalog.Save();
    EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
  }
}

TEST_F(CatalogPagesTest, OneLongPathInAllFilesIsRefused) {
  std::filesystem::remove(CATALOG);
  Catalog(VOLUME).AddPhoto(std::string(900'000, 'x'), 1, 1);
  for (const char* const table : {"Files", "Transcodings"}) {
    const std::uint32_t root = RootPage(CATALOG, table);
    CraftedDatabase catalog(CATALOG);
    catalog.RepeatCell(root, 0);
    catalog.Save();
  }
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

// Rows that are skipped, each with a megabyte to skip.
TEST_F(CatalogPagesTest, OneLongPathInAllHiddenFoldersIsRefused) {
  std::filesystem::remove(CATALOG);
  Catalog(VOLUME).Add(
      FolderRow{.id = 1, .path = std::string(900'000, 'x') + "/", .isHidden = true});
  const std::uint32_t root = RootPage(CATALOG, "Folders");
  CraftedDatabase catalog(CATALOG);
  catalog.RepeatCell(root, 0);
  catalog.Multiply(root, 12);
  catalog.Save();
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

} // namespace
} // namespace orva::test
