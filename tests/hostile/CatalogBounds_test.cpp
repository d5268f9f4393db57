// The bounds of time and memory for a catalog that neither its file system nor a single large row
// may raise.

#include "HostileTest.h"
#include "Messages.h"
#include "Tracer.h"

#include "support/Programs.h"

#include "orvautil/FormatString.h"

#include <sys/syscall.h>
#include <unistd.h>

#include <filesystem>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::StartsWith;

/// Catalogs with a few pages that other pages name many times.
class CatalogBoundsTest : public HostileTest {
protected:
  /// Repeats the rows of a table, 681 to the power of 12 times.
  static void Multiply(const std::string& table) {
    const std::uint32_t root = RootPage(CATALOG, table);
    CraftedDatabase catalog(CATALOG);
    catalog.Multiply(root, 12);
    catalog.Save();
  }
};

/// A table with endless rows, in a sparse file on a file system that claims to have allocated all
/// of it.
struct Endless {
  std::string name;
  std::vector<std::string> statements; ///< change a good catalog
  std::string table;
};

void PrintTo(const Endless& endless, std::ostream* stream) {
  *stream << endless.name;
}

class ClaimedBlocksTest : public CatalogBoundsTest,
                          public ::testing::WithParamInterface<Endless> {};

TEST_P(ClaimedBlocksTest, DoNotRaiseTheBounds) {
  Catalog catalog(VOLUME);
  AddPhotos(catalog);
  for (const std::string& statement : GetParam().statements) {
    catalog.Rows().Run(statement);
  }
  Multiply(GetParam().table);
  fs::resize_file(CATALOG, 1ULL << 40U);
  // The address sanitizer's runtime otherwise requires to be the first library.
  const char* const asan = std::getenv("ASAN_OPTIONS");
  environment = {"LD_PRELOAD=" + ProgramPath("libclaimed_blocks.so"),
                 std::string("ASAN_OPTIONS=verify_asan_link_order=0:") +
                     (asan != nullptr ? asan : "")};
  EXPECT_EQ(Outcome::Refused, MergeHostileVolume());
}

INSTANTIATE_TEST_SUITE_P(
    Of, ClaimedBlocksTest,
    ::testing::Values(Endless{"Folders", {}, "Folders"},
                      Endless{"HiddenFolders", {"UPDATE Folders SET isHidden = 1"}, "Folders"},
                      Endless{"Files", {}, "Files"},
                      Endless{"FilesToCount", {"DELETE FROM Transcodings"}, "Files"},
                      Endless{"Transcodings", {}, "Transcodings"},
                      Endless{"OtherTranscodings",
                              {"UPDATE Transcodings SET profile = 'another'"},
                              "Transcodings"}),
    [](const auto& tested) { return tested.param.name; });

/// A catalog with one large row, which its pages name many times.
class LargeRowTest : public CatalogBoundsTest {
protected:
  /// Megabytes. SQLite's limit for our connections is 16 MiB.
  const int size = TestScale(3, 14);
  const std::string path = std::string(static_cast<std::size_t>(size) * 1'000'000, 'x');

  /// Repeats the first row of the table.
  void ExpectRefusedInTime(const std::string& table) {
    const std::uint32_t root = RootPage(CATALOG, table);
    CraftedDatabase catalog(CATALOG);
    catalog.RepeatCell(root, 0);
    catalog.Save();
    Multiply(table);
    deadline = std::chrono::minutes(10); // the machine may be busy: processor time counts
    EXPECT_EQ(Outcome::Refused, MergeHostileVolume());

    const double longest = AreProgramsSanitized() ? 4 : 1;
    const double seconds =
        LastAttempt().processorSeconds * (1 << 20) / static_cast<double>(fs::file_size(CATALOG));
    EXPECT_LT(seconds, longest) << "for each MiB of the catalog";
    ReportFigure("processor time for each MiB of a large row that stands for many",
                 util::FormatString("%.2f s", seconds));
  }
};

TEST_F(LargeRowTest, InAllHiddenFoldersIsRefusedInTime) {
  Catalog(VOLUME).Add(FolderRow{.id = 1, .path = path + "/", .isHidden = true});
  ExpectRefusedInTime("Folders");
}

TEST_F(LargeRowTest, InAllFoldersIsRefusedInTime) {
  Catalog(VOLUME).Add(FolderRow{.id = 1, .path = path + "/"});
  ExpectRefusedInTime("Folders");
}

TEST_F(LargeRowTest, WithALargeFlagInAllFoldersIsRefusedInTime) {
  Catalog catalog(VOLUME);
  catalog.AddFolder("a/");
  catalog.Rows().Run("UPDATE Folders SET isSystem = ?", {path});
  ExpectRefusedInTime("Folders");
}

TEST_F(LargeRowTest, WithALargeCategoryInAllFilesIsRefusedInTime) {
  Catalog catalog(VOLUME);
  catalog.Add(FileRow{.id = 1, .path = "a.jpg"});
  catalog.Rows().Run("UPDATE Files SET category = ?", {path});
  ExpectRefusedInTime("Files");
}

TEST_F(LargeRowTest, InAllFilesToCountIsRefusedInTime) {
  Catalog(VOLUME).Add(FileRow{.id = 1, .path = path, .isHidden = true});
  ExpectRefusedInTime("Files");
}

TEST_F(LargeRowTest, InAllTranscodingsIsRefusedInTime) {
  Catalog catalog(VOLUME);
  catalog.Add(FileRow{.id = 1, .path = "a.jpg"});
  catalog.Add(TranscodingRow{.sourceId = 1, .lastUpdatedDate = 1, .profile = path});
  ExpectRefusedInTime("Transcodings");
}

/// The daemon with a catalog that is larger than the page cache of a connection.
class DamagedCatalog : public SystemTest {
protected:
  /// Merges the volume, and returns how often the daemon reads from its catalog.
  int Reads() {
    Tracer tracer(appliance.Daemon().Pid());
    appliance.Service().Send(TranscodedBatch(vol.Path()));
    const std::string last = appliance.SendBarrier();
    int reads = 0;
    tracer.RunUntil([&](const SystemCall& call) {
      reads += IsCatalogRead(call) ? 1 : 0;
      return tracer.Data(call).find(last) != std::string::npos;
    });
    return reads;
  }

  const Volume master{"Master", "150g"};
  const Volume vol{"Vol", "1g"};

private:
  bool IsCatalogRead(const SystemCall& call) const {
    if (call.number != SYS_pread64 && call.number != SYS_read) {
      return false;
    }
    std::error_code error;
    const fs::path file =
        fs::read_symlink(util::FormatString("/proc/%d/fd/%d", appliance.Daemon().Pid(),
                                            static_cast<int>(call.arguments[0])),
                         error);
    return file.filename() == "orva.db";
  }
};

TEST_F(DamagedCatalog, IsNotCountedAfterTheReadOfItsFilesHasFailed) {
  Catalog(vol).AddPhotos("", 60'000, 1000);
  const std::uint32_t root = RootPage(CATALOG, "Transcodings");
  CraftedDatabase catalog(CATALOG);
  for (std::size_t i = 0; i < catalog.PageSize(); ++i) {
    catalog.File()[catalog.Offset(root) + i] = 0;
  }
  catalog.Save();
  appliance.Start();
  appliance.Handle(Plugged(master.Path()));
  appliance.Handle(Plugged(vol.Path()));
  appliance.Handle(Scanned(master.Path()));

  // Each count reads the whole table of the files.
  EXPECT_LT(Reads(), 100);
  appliance.Barrier();
  const Log log = appliance.TakeLog();
  ASSERT_FALSE(log.empty());
  EXPECT_THAT(log.back().text, StartsWith("Error that we will ignore "));
}

} // namespace
} // namespace orva::test
