// The list of the photos that could not be rendered, from the catalogs of the volumes.

#include "ServiceFiles.h"
#include "ZophotosTest.h"

#include "hostile/CraftedDatabase.h"
#include "support/OtherUsers.h"
#include "support/Programs.h"

#include <sys/stat.h>

#include <algorithm>
#include <filesystem>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::AllOf;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::StartsWith;

const std::string NONE = "No photo has failed.\n";

/// A photo that failed on each of A, B and D, and one in a folder of B.
class ZophotosFailed : public ZophotosTest {
protected:
  void SetUp() override {
    ZophotosTest::SetUp();
    for (const Catalog* const catalog : {&onA, &onB, &onD}) {
      AddTable(*catalog);
    }
    AddFailure(onA, "broken.jpg", "not an image");
    AddFailure(onB, "Old/z.jpg", "took longer than 60 s");
    AddFailure(onB, "a.jpg", "too large: 20000 x 20000 pixels");
    AddFailure(onD, "d.jpg", "not an image");
  }

  static void AddTable(const Catalog& catalog) {
    catalog.Rows().Run("CREATE TABLE Failures(fileId INTEGER PRIMARY KEY, reason TEXT NOT NULL)");
  }

  static void AddFailure(Catalog& catalog, const std::string& path, const std::string& reason) {
    AddUntranscoded(catalog, path);
    catalog.Rows().Run("INSERT INTO Failures SELECT id, ? FROM Files WHERE path = ?",
                       {reason, path});
  }

  static std::string CatalogOf(const Volume& volume) { return volume.Path() + "/.orva/orva.db"; }

  /// Expects that the catalog of B cannot be read, and that the photos of the others are listed.
  void ExpectOnlyBUnread(const std::string& reason) const {
    const Outcome outcome = Zophotos({"failed"});
    EXPECT_EQ(1, outcome.status);
    EXPECT_EQ("/shares/A/broken.jpg\tnot an image\n/shares/D/d.jpg\tnot an image\n",
              outcome.output);
    EXPECT_EQ("zophotos: " + CatalogOf(b) + ": " + reason + "\n", outcome.error);
  }
};

TEST_F(ZophotosFailed, ListsPathsAndReasons) {
  ExpectOutput(Zophotos({"failed"}), "/shares/A/broken.jpg\tnot an image\n"
                                     "/shares/B/Old/z.jpg\ttook longer than 60 s\n"
                                     "/shares/B/a.jpg\ttoo large: 20000 x 20000 pixels\n"
                                     "/shares/D/d.jpg\tnot an image\n");
}

TEST_F(ZophotosFailed, PrintsOneObjectPerLineInJson) {
  ExpectOutput(Zophotos({"failed", "--json", "A"}),
               R"({"path":"/shares/A/broken.jpg","volume":"/shares/A/","reason":"not an image"})"
               "\n");
}

TEST_F(ZophotosFailed, LeavesOutPhotosThatWaitAgainOrAreGone) {
  onA.Rows().Run("UPDATE Files SET status = 1 WHERE path = 'broken.jpg'");
  onD.Rows().Run("UPDATE Files SET isDeleted = 1 WHERE path = 'd.jpg'");
  onB.Rows().Run("DELETE FROM Files WHERE path = 'a.jpg'");
  ExpectOutput(Zophotos({"failed"}), "/shares/B/Old/z.jpg\ttook longer than 60 s\n");
}

TEST_F(ZophotosFailed, SaysThatNoPhotoHasFailed) {
  ExpectOutput(Zophotos({"failed", "C"}), NONE);
  ExpectOutput(Zophotos({"failed", "C", "--json"}), "");
  onA.Rows().Run("DELETE FROM Failures");
  ExpectOutput(Zophotos({"failed", "A"}), NONE);
  for (const Catalog* const catalog : {&onA, &onB, &onD}) {
    catalog->Rows().Run("DROP TABLE Failures");
  }
  ExpectOutput(Zophotos({"failed"}), NONE);
}

TEST_F(ZophotosFailed, ListsThePhotosAtAPath) {
  const std::string old = "/shares/B/Old/z.jpg\ttook longer than 60 s\n";
  for (const char* const path : {"B/Old", "/shares/B/Old/", "B//Old/.", "B/Old/z.jpg"}) {
    ExpectOutput(Zophotos({"failed", path}), old);
  }
  for (const char* const path : {"B", "/shares/B", "/shares/B/", "B/../B"}) {
    ExpectOutput(Zophotos({"failed", path}),
                 old + "/shares/B/a.jpg\ttoo large: 20000 x 20000 pixels\n");
  }
  ExpectOutput(Zophotos({"failed", "/shares"}), Zophotos({"failed"}).output);
}

TEST_F(ZophotosFailed, ReportsAPathWithNothing) {
  const std::string error = "zophotos: there is no folder or file /shares/B/Ol\n";
  ExpectError(Zophotos({"failed", "B/Ol"}), 1, error);
  ExpectError(Zophotos({"failed", "--json", "B/Ol"}), 1, error);
  fs::create_directories("/shares/B/Ol");
  ExpectOutput(Zophotos({"failed", "B/Ol"}), NONE);
  std::ofstream("/shares/B/Ol/x.jpg");
  ExpectOutput(Zophotos({"failed", "B/Ol/x.jpg"}), NONE);
  ExpectError(Zophotos({"failed", "B/Ol/x.jpg/y"}), 1,
              "zophotos: there is no folder or file /shares/B/Ol/x.jpg/y\n");
}

TEST_F(ZophotosFailed, ReportsAPathThatIsOnNoVolume) {
  ExpectError(Zophotos({"failed", "E/x"}), 1, "zophotos: /shares/E/x is not on a volume\n");
  ExpectError(Zophotos({"failed", "/elsewhere"}), 1, "zophotos: /elsewhere is not on a volume\n");
}

TEST_F(ZophotosFailed, EscapesNamesOnRequestAndReasonsAlways) {
  const std::string name = "x\n\x1b[\xff\\.jpg";
  AddFailure(onA, name, "bad\n\x1b[2J\xff");
  const std::string reason = "\tbad\\x0a\\x1b[2J\\xff\n";
  ExpectOutput(Zophotos({"failed", "A/" + name}), "/shares/A/" + name + reason);
  const std::string escaped = R"(/shares/A/x\x0a\x1b[\xff\\.jpg)";
  ExpectOutput(Zophotos({"failed", "--escape", escaped}), escaped + reason);
  EXPECT_THAT(Zophotos({"failed", "--json"}).output,
              HasSubstr(R"("path":"/shares/A/x\n\u001b[)"
                        "\uFFFD"
                        R"(\\.jpg","volume":"/shares/A/","reason":"bad\n\u001b[2J)"
                        "\uFFFD\"}\n"));
}

TEST_F(ZophotosFailed, ReadsTheVolumesOfTheServices) {
  fs::create_directories("/tmp/photos");
  Catalog other("/tmp/photos");
  AddTable(other);
  AddFailure(other, "o.jpg", "not an image");
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/tmp/photos/", "watching", "0"));
  EXPECT_THAT(Zophotos({"failed"}).output, AllOf(StartsWith("/shares/A/broken.jpg\t"),
                                                 EndsWith("\n/tmp/photos/o.jpg\tnot an image\n")));
  fs::remove(LOCATOR);
  ExpectOutput(Zophotos({"failed"}), "/tmp/photos/o.jpg\tnot an image\n");
  fs::remove_all(INDEXER_FOLDER);
  ExpectError(Zophotos({"failed"}), 3,
              "zophotos: no merged database: " + LOCATOR +
                  " does not exist; the daemon creates it when it starts\n");
}

TEST_F(ZophotosFailed, LeavesOutVolumesWithoutACatalog) {
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/E/", "walking", "0"));
  appliance.Handle(Unplugged(c.Path()));
  fs::remove(CatalogOf(b));
  fs::remove_all("/shares/C/.orva");
  ExpectOutput(Zophotos({"failed"}),
               "/shares/A/broken.jpg\tnot an image\n/shares/D/d.jpg\tnot an image\n");
  ExpectOutput(Zophotos({"failed", "E"}), NONE);
}

TEST_F(ZophotosFailed, ReadsTheLogOfACatalog) {
  onB.Rows().Run("PRAGMA journal_mode = WAL");
  AddFailure(onB, "late.jpg", "not an image");
  ASSERT_LT(0U, fs::file_size(CatalogOf(b) + "-wal"));
  ExpectOutput(Zophotos({"failed", "B/late.jpg"}), "/shares/B/late.jpg\tnot an image\n");
}

TEST_F(ZophotosFailed, WaitsForNoWriterInWalMode) {
  onB.Rows().Run("PRAGMA journal_mode = WAL");
  onB.Rows().Run("BEGIN IMMEDIATE");
  AddFailure(onB, "late.jpg", "not an image");
  EXPECT_THAT(Zophotos({"failed", "B"}).output,
              AllOf(StartsWith("/shares/B/Old/z.jpg\t"), Not(HasSubstr("late"))));
  onB.Rows().Run("COMMIT");
}

TEST_F(ZophotosFailed, KeepsNoVolumeBusyWhileItPrints) {
  onB.Rows().Run("BEGIN");
  for (int i = 0; i < 4000; ++i) { // more than a pipe takes
    AddFailure(onB, std::to_string(i) + ".jpg", "not an image");
  }
  onB.Rows().Run("COMMIT");
  Program program(ZophotosCommand({"failed", "B"}));
  EXPECT_EQ("/shares/B/0.jpg\tnot an image", program.ReadLine());
  for (const auto& file :
       fs::directory_iterator("/proc/" + std::to_string(program.Pid()) + "/fd")) {
    EXPECT_THAT(fs::read_symlink(file).string(), Not(StartsWith("/shares/")));
  }
  std::string output;
  program.ReadToEnd(output, output);
  EXPECT_EQ(4001, std::ranges::count(output, '\n'));
  EXPECT_EQ(0, program.WaitForEnd());
}

TEST_F(ZophotosFailed, ReportsCatalogsThatAreNotDatabases) {
  fs::remove(CatalogOf(b));
  std::ofstream(CatalogOf(b)) << std::string(5000, 'x');
  ExpectOnlyBUnread("file is not a database");
  fs::remove(CatalogOf(b));
  ASSERT_EQ(0, mkfifo(CatalogOf(b).c_str(), 0666));
  ExpectOnlyBUnread("'" + CatalogOf(b) + "' is not a regular file");
}

TEST_F(ZophotosFailed, FollowsNoLinks) {
  fs::rename(CatalogOf(b), "/shares/B/real.db");
  for (const char* const target : {"/shares/B/real.db", "/nowhere"}) {
    fs::remove(CatalogOf(b));
    fs::create_symlink(target, CatalogOf(b));
    ExpectOnlyBUnread("unable to open database file");
  }
  fs::remove(CatalogOf(b));
  fs::rename("/shares/B/real.db", CatalogOf(b));
  fs::rename("/shares/B/.orva", "/shares/B/real");
  fs::create_symlink("/shares/B/real", "/shares/B/.orva");
  ExpectOnlyBUnread("unable to open database file");
}

TEST_F(ZophotosFailed, ReportsALogOnAReadOnlyVolume) {
  onB.Rows().Run("PRAGMA journal_mode = WAL");
  AddFailure(onB, "late.jpg", "not an image");
  fs::copy_file(CatalogOf(b), "/shares/B/copy");
  fs::copy_file(CatalogOf(b) + "-wal", "/shares/B/copy-wal");
  Volume other("E", "1m");
  fs::create_directory("/shares/E/.orva");
  fs::copy_file("/shares/B/copy", CatalogOf(other));
  other.MakeReadOnly();
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/E/", "read-only", "0"));
  ExpectOutput(Zophotos({"failed", "E"}), "/shares/E/Old/z.jpg\ttook longer than 60 s\n"
                                          "/shares/E/a.jpg\ttoo large: 20000 x 20000 pixels\n");
  other.MakeWritable();
  fs::copy_file("/shares/B/copy-wal", CatalogOf(other) + "-wal");
  other.MakeReadOnly();
  ExpectError(Zophotos({"failed", "E"}), 1,
              "zophotos: " + CatalogOf(other) + ": '" + CatalogOf(other) +
                  "' has a write-ahead log, which cannot be read on a read-only file system\n");
}

TEST_F(ZophotosFailed, ReportsACatalogWithoutPermission) {
  SKIP_WITHOUT_OTHER_USERS();
  const Arguments command{"setpriv", "--reuid", "65534", "--clear-groups", ProgramPath("zophotos"),
                          "failed"};
  fs::permissions(CatalogOf(b), fs::perms::none);
  const Outcome outcome = test::Run(command);
  EXPECT_EQ(1, outcome.status);
  EXPECT_EQ("/shares/A/broken.jpg\tnot an image\n/shares/D/d.jpg\tnot an image\n", outcome.output);
  EXPECT_EQ("zophotos: " + CatalogOf(b) + ": Permission denied\n", outcome.error);
  fs::permissions("/shares/D/.orva", fs::perms::none);
  EXPECT_THAT(test::Run(command).error,
              HasSubstr("zophotos: " + CatalogOf(d) + ": Permission denied\n"));
}

TEST_F(ZophotosFailed, ReadsOnlyVolumesInTheSharesRootOfAnUntrustedDatabase) {
  fs::create_directories("/tmp/photos");
  Catalog other("/tmp/photos");
  AddTable(other);
  AddFailure(other, "o.jpg", "not an image");
  fs::create_directories("/shares/A/inner");
  Catalog inner("/shares/A/inner");
  AddTable(inner);
  AddFailure(inner, "i.jpg", "not an image");
  const Database copy = Copy();
  for (const char* const volume :
       {"/tmp/photos/", "/shares/../tmp/photos/", "/shares/A/inner/", "/shares/..", "/shares/../",
        "/shares/./", "/shares//", "/shares/", "", "tmp/photos/", "/shares/A"}) {
    copy.Run("INSERT INTO Statistics(volume, photos_xcoded, photos_total, last_updated_time) "
             "VALUES(?, 0, 0, 0)",
             {volume});
  }
  copy.Run("UPDATE Statistics SET volume = CAST(x'2f7368617265732f4100' AS TEXT) || '/' WHERE "
           "volume = ''");
  ExpectOutput(OnCopy({"failed"}), Zophotos({"failed"}).output);
}

TEST_F(ZophotosFailed, RunsNothingOfAnUntrustedCatalog) {
  onB.Rows().Run("ALTER TABLE Failures RENAME TO Real");
  onB.Rows().Run("CREATE VIEW Failures AS SELECT * FROM Real");
  EXPECT_EQ(2, std::ranges::count(Zophotos({"failed"}).output, '\n'));
  onB.Rows().Run("DROP VIEW Failures");
  onB.Rows().Run(
      "CREATE TABLE Failures(fileId INTEGER PRIMARY KEY, other, reason TEXT AS (other))");
  ExpectOnlyBUnread("generated column in table Failures of '" + CatalogOf(b) + "'");
  onB.Rows().Run("DROP TABLE Failures");
  onB.Rows().Run("CREATE TABLE Failures(other)");
  ExpectOnlyBUnread("no such column: f.reason");
}

TEST_F(ZophotosFailed, EndlessRowsEnd) {
  AddFailure(onB, std::string(100'000, 'p'), std::string(100'000, 'r'));
  const std::uint32_t root = static_cast<std::uint32_t>(std::stoul(
      onB.Rows().Run("SELECT rootpage FROM sqlite_schema WHERE name = 'Failures'").at(0)));
  CraftedDatabase crafted(CatalogOf(b));
  crafted.Multiply(root, 3);
  crafted.Save();
  ExpectOnlyBUnread("more failed photos than a file of its size can hold");
}

} // namespace
} // namespace orva::test
