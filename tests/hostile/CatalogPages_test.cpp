// Catalogs whose pages are joined as SQLite never joins them: a small file that reads as a huge
// one.

#include "HostileTest.h"

#include <filesystem>
#include <fstream>

namespace orva::test {
namespace {

class CatalogPagesTest : public HostileTest {
protected:
  CatalogPagesTest() { MakeCatalog(); }

  /// Makes the catalog anew, with some photos.
  static void MakeCatalog() {
    std::filesystem::remove(CATALOG);
    Catalog catalog(VOLUME);
    AddPhotos(catalog);
  }

  static std::uint32_t RootOf(const std::string& name) {
    return static_cast<std::uint32_t>(std::stoul(
        Database(CATALOG).Run("SELECT rootpage FROM sqlite_schema WHERE name = ?", {name}).at(0)));
  }

  static void Run(const std::string& sql, const Database::Values& values = {}) {
    Database(CATALOG).Run(sql, values);
  }

  /// Makes the rows of a table come again and again, 681 to the power of `levels` times.
  static void Multiply(const std::string& table, unsigned levels) {
    const std::uint32_t root = RootOf(table);
    CraftedDatabase catalog(CATALOG);
    catalog.Multiply(root, levels);
    catalog.Save();
  }
};

TEST_F(CatalogPagesTest, FoldersWithoutEnd) {
  for (const unsigned levels : {1U, 2U, 4U, 12U}) {
    SCOPED_TRACE(levels);
    MakeCatalog();
    Multiply("Folders", levels);
    EXPECT_NE(Outcome::Broken, MergeHostileVolume());
  }
}

TEST_F(CatalogPagesTest, HiddenFoldersWithoutEnd) {
  Run("UPDATE Folders SET isHidden = 1");
  Multiply("Folders", 12);
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_F(CatalogPagesTest, FilesWithoutEnd) {
  Multiply("Files", 12);
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

// Files that no transcoding belongs to, so that nothing is read but counted.
TEST_F(CatalogPagesTest, FilesToCountWithoutEnd) {
  Run("DELETE FROM Transcodings");
  Multiply("Files", 12);
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_F(CatalogPagesTest, TranscodingsWithoutEnd) {
  for (const std::string& profile :
       {std::string(notify::TRANSCODING_PROFILE), std::string("another")}) {
    SCOPED_TRACE(profile);
    Run("UPDATE Transcodings SET profile = ?", {profile});
    Multiply("Transcodings", 12);
    EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
    MakeCatalog();
  }
}

TEST_F(CatalogPagesTest, EveryTableWithoutEnd) {
  Multiply("Folders", 12);
  Multiply("Files", 12);
  Multiply("Transcodings", 12);
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

// What bounds the work in proportion to the file must not be had for nothing: a hole costs nothing.
TEST_F(CatalogPagesTest, FoldersWithoutEndInAFileFullOfHoles) {
  Multiply("Folders", 12);
  std::filesystem::resize_file(CATALOG, 1ULL << 40U);
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_F(CatalogPagesTest, HiddenFoldersWithoutEndInAFileFullOfHoles) {
  Run("UPDATE Folders SET isHidden = 1");
  Multiply("Folders", 12);
  std::filesystem::resize_file(CATALOG, 1ULL << 40U);
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_F(CatalogPagesTest, HiddenFoldersWithoutEndBesideALogFullOfHoles) {
  Run("UPDATE Folders SET isHidden = 1");
  Multiply("Folders", 12);
  for (const char* const suffix : {"-journal", "-wal", "-shm"}) {
    SCOPED_TRACE(suffix);
    std::ofstream(CATALOG + suffix).flush();
    std::filesystem::resize_file(CATALOG + suffix, 1ULL << 40U);
    catalogHasWal = true; // a log is one where the catalog does not say so, too
    EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
    std::filesystem::remove(CATALOG + suffix);
  }
}

TEST_F(CatalogPagesTest, HiddenFoldersWithoutEndInALogAboveAHole) {
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

TEST_F(CatalogPagesTest, FoldersWithoutEndInALogThatClaimsAHugeDatabase) {
  Run("UPDATE Folders SET isHidden = 1");
  Multiply("Folders", 12);
  Run("PRAGMA journal_mode = WAL");
  catalogHasWal = true;
  Bytes page = Bytes::Of(CATALOG).Part(0, 4096);
  page.Write(28, 4, 0x7fffffff);
  CraftedWal(4096, 0x7fffffff, {{1, page}}).Save(CATALOG + "-wal");
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

// A row of the schema that may come any number of times: that of an index without a text.
TEST_F(CatalogPagesTest, SchemaWithoutEnd) {
  Run("CREATE TABLE Last(a UNIQUE)");
  CraftedDatabase catalog(CATALOG);
  const std::uint32_t repeated = catalog.CopyOf(1);
  catalog.RepeatCell(repeated, catalog.Cells(repeated) - 1);
  catalog.MultiplyBehind(1, repeated, 12);
  catalog.Save();
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_F(CatalogPagesTest, SchemaThatContainsItself) {
  CraftedDatabase catalog(CATALOG);
  catalog.Multiply(1, 1);
  catalog.SetRightChild(1, 1);
  catalog.Save();
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

TEST_F(CatalogPagesTest, TableThatContainsItself) {
  const std::uint32_t root = RootOf("Folders");
  CraftedDatabase catalog(CATALOG);
  catalog.Multiply(root, 1);
  catalog.SetRightChild(root, root);
  catalog.Save();
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

// One long path, in as many rows as there is room for: each with the same pages behind it.
TEST_F(CatalogPagesTest, OneLongPathInAllRows) {
  for (const unsigned levels : {0U, 1U, 12U}) {
    SCOPED_TRACE(levels);
    std::filesystem::remove(CATALOG);
    Catalog(VOLUME).AddFolder(std::string(900'000, 'x') + "/");
    const std::uint32_t root = RootOf("Folders");
    CraftedDatabase catalog(CATALOG);
    catalog.RepeatCell(root, 0);
    if (levels > 0) {
      catalog.Multiply(root, levels);
    }
    catalog.Save();
    EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
  }
}

TEST_F(CatalogPagesTest, OneLongPathInAllFiles) {
  std::filesystem::remove(CATALOG);
  Catalog(VOLUME).AddPhoto(std::string(900'000, 'x'), 1, 1);
  for (const char* const table : {"Files", "Transcodings"}) {
    const std::uint32_t root = RootOf(table);
    CraftedDatabase catalog(CATALOG);
    catalog.RepeatCell(root, 0);
    catalog.Save();
  }
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

// Rows that are passed over, each with a megabyte to pass over.
TEST_F(CatalogPagesTest, OneLongColumnInAllHiddenRows) {
  std::filesystem::remove(CATALOG);
  Catalog(VOLUME).Add(
      FolderRow{.id = 1, .path = std::string(900'000, 'x') + "/", .isHidden = true});
  const std::uint32_t root = RootOf("Folders");
  CraftedDatabase catalog(CATALOG);
  catalog.RepeatCell(root, 0);
  catalog.Multiply(root, 12);
  catalog.Save();
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

} // namespace
} // namespace orva::test
