#include "Catalog.h"
#include "Expectations.h"
#include "Messages.h"
#include "Tracer.h"

#include "support/TestScale.h"

#include <sys/syscall.h>

#include <atomic>
#include <chrono>
#include <random>
#include <thread>

namespace orva::test {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::StartsWith;
using namespace std::chrono_literals;

constexpr unsigned WRITER_SEED = 20'081;

/// The content of volume B's catalog at one time. Each generation has a new folder with another
/// number of photos; the number of the generation is their stamp.
struct Generation {
  int number;

  int Photos() const { return 40 + number % 23; }
  int Rendered() const { return Photos() - number % 7; }
  std::string Folder() const { return "Generation" + std::to_string(number) + "/"; }

  Lines Folders() const {
    return {ROOT_FOLDER, "/shares/B/|/shares/|0|/shares/B/",
            "/shares/B/" + Folder() + "|/shares/B/|" + std::to_string(number) + "|/shares/B/"};
  }
  Lines Files() const {
    Lines files;
    const std::string times = std::to_string(number) + "|" + std::to_string(number);
    for (int i = 0; i < Photos(); ++i) {
      files.push_back("/shares/B/" + Folder() + std::to_string(i) + ".jpg|" + times +
                      "|/shares/B/");
    }
    std::sort(files.begin(), files.end());
    return files;
  }
  std::string Statistics() const {
    return "/shares/B/|" + std::to_string(Rendered()) + "|" + std::to_string(Photos()) + "|" +
           std::to_string(number);
  }
};

/// The indexer of B. Replaces a generation with the next one in one transaction.
class Indexer {
public:
  Indexer(const Volume& volume, const std::string& journal) : catalog_(volume) {
    catalog_.Rows().Run("PRAGMA journal_mode = " + journal);
    catalog_.Rows().Run("CREATE INDEX FilesByFolder ON Files(folderId)");
    catalog_.Rows().Run("CREATE INDEX TranscodingsBySource ON Transcodings(sourceId)");
    Write({1});
    Commit();
  }

  /// Begins the transaction and writes everything.
  void Write(const Generation& next) {
    const std::string stamp = std::to_string(next.number);
    const std::string former = Generation{next.number - 1}.Folder();
    const Database& rows = catalog_.Rows();
    rows.Run("BEGIN IMMEDIATE");
    rows.Run("UPDATE Transcodings SET status = 0, lastUpdatedDate = ? WHERE sourceId IN (SELECT id "
             "FROM Files WHERE folderId = (SELECT id FROM Folders WHERE path = ?))",
             {stamp, former});
    rows.Run("UPDATE Files SET isDeleted = 1 WHERE folderId = (SELECT id FROM Folders WHERE "
             "path = ?)",
             {former});
    catalog_.DeleteFolder(former);
    catalog_.AddFolder(next.Folder(), next.number);
    catalog_.AddPhotos(next.Folder(), next.Photos(), next.number);
    rows.Run("UPDATE Files SET status = 1 WHERE id > (SELECT max(id) FROM Files) - CAST(? AS "
             "INTEGER)",
             {std::to_string(next.Photos() - next.Rendered())});
  }

  void Commit() { catalog_.Rows().Run("COMMIT"); }

  /// Commits if it need not wait for a lock. Returns whether it did.
  bool TryCommit() {
    catalog_.Rows().Run("PRAGMA busy_timeout = 0");
    bool committed = true;
    try {
      Commit();
    } catch (const std::runtime_error&) {
      committed = false;
    }
    catalog_.Rows().Run("PRAGMA busy_timeout = 60000");
    return committed;
  }

  const Database& Rows() const { return catalog_.Rows(); }

private:
  Catalog catalog_;
};

/// Merges of B into A while B's catalog is written, in either of SQLite's journal modes.
class CatalogWriter : public SystemTest, public ::testing::WithParamInterface<const char*> {
protected:
  void SetUp() override {
    appliance.Start();
    for (const Volume* volume : {&a, &b}) {
      appliance.Handle(Plugged(volume->Path()));
    }
    appliance.Handle(Scanned(a.Path()));
  }

  static bool IsWal() { return std::string(GetParam()) == "wal"; }

  void ExpectMerged(const Generation& generation) const {
    const MergedDatabase merged(a.Path());
    EXPECT_EQ(generation.Folders(), merged.Folders());
    EXPECT_EQ(generation.Files(), merged.Files());
    EXPECT_THAT(merged.Statistics(), ElementsAre(generation.Statistics()));
  }

  /// The generation whose stamp the merged database has.
  Generation Merged() const {
    const Lines stamp =
        MergedDatabase(a.Path()).Rows().Run("SELECT last_updated_time FROM Statistics");
    return {std::stoi(stamp.at(0))};
  }

  Lines HandleForErrors(const std::string& message) {
    appliance.Service().Send(message);
    return AwaitErrors();
  }

  /// The errors that are logged until the daemon has handled everything.
  Lines AwaitErrors() {
    appliance.Barrier();
    Lines errors;
    for (const LogLine& line : appliance.TakeLog()) {
      if (line.priority == Error("").priority) {
        errors.push_back(line.text);
      }
    }
    return errors;
  }

  const Volume a{"A", "150g"};
  const Volume b{"B", "1g"};
  Indexer indexer{b, GetParam()};
};

TEST_P(CatalogWriter, ThatCommitsBetweenTwoReadsOfAMergeIsLeftForTheNext) {
  // Held after the folders were read, and after the files were.
  int generation = 1;
  for (const char* const line : {"Retrieved changed folders list", "changed files list"}) {
    indexer.Write({generation + 1});
    bool committed = false;
    {
      Tracer tracer(appliance.Daemon().Pid());
      appliance.Service().Send(TranscodedBatch(b.Path()));
      tracer.RunUntil([&](const SystemCall& call) {
        return call.number == SYS_sendto && tracer.Data(call).find(line) != std::string::npos;
      });
      committed = indexer.TryCommit();
    }
    appliance.Barrier();
    EXPECT_EQ(IsWal(), committed) << "only in WAL mode can a writer commit while a program reads";
    ExpectMerged({generation});
    if (!committed) {
      indexer.Commit();
    }
    ++generation;
    EXPECT_THAT(HandleForErrors(TranscodedBatch(b.Path())), IsEmpty());
    ExpectMerged({generation});
  }
}

TEST_P(CatalogWriter, ThatCommitsWhileMergesRunIsSeenAtOneOfItsCommits) {
  const int merges = TestScale(100, 500);
  std::atomic<int> begun = 0; // merges
  std::atomic<int> latest = 1;
  std::thread writer([&] {
    std::mt19937 random(WRITER_SEED);
    for (int merge = 0; merge < merges; ++merge) {
      begun.wait(merge);
      for (auto commits = 1 + random() % 4; commits > 0; --commits) {
        indexer.Write({latest + 1});
        indexer.Commit();
        ++latest;
      }
    }
  });
  int overtaken = 0;
  for (int i = 0; i < merges; ++i) {
    const int least = latest;
    ++begun;
    begun.notify_all();
    EXPECT_THAT(HandleForErrors(TranscodedBatch(b.Path())), IsEmpty());
    const Generation merged = Merged();
    SCOPED_TRACE("seed " + std::to_string(WRITER_SEED) + ", generation " +
                 std::to_string(merged.number));
    EXPECT_GE(merged.number, least);
    ExpectMerged(merged);
    overtaken += merged.number > least ? 1 : 0;
  }
  writer.join();
  EXPECT_THAT(HandleForErrors(TranscodedBatch(b.Path())), IsEmpty());
  ExpectMerged({latest});
  const std::string mode = std::string(", journal mode ") + GetParam();
  ReportFigure("merges while their catalog was written" + mode, std::to_string(merges));
  ReportFigure("commits to the catalog in these merges" + mode, std::to_string(latest - 1));
  ReportFigure("these merges that saw a commit made after they were asked for" + mode,
               std::to_string(overtaken));
}

INSTANTIATE_TEST_SUITE_P(In, CatalogWriter, ::testing::Values("delete", "wal"),
                         [](const auto& tested) { return std::string(tested.param); });

/// A writer that locks out all readers, which does not exist in WAL mode.
class CatalogLocked : public CatalogWriter {
protected:
  void SetUp() override {
    CatalogWriter::SetUp();
    appliance.Handle(TranscodedBatch(b.Path()));
    ExpectMerged({1});
    indexer.Write({2});
    indexer.Commit();
    indexer.Rows().Run("BEGIN EXCLUSIVE");
  }
};

TEST_P(CatalogLocked, ForFiveSecondsIsWaitedFor) {
  {
    Tracer tracer(appliance.Daemon().Pid());
    EXPECT_EQ(5s, appliance.HandleUntilSlept(tracer, TranscodedBatch(b.Path()), 5s));
    ExpectMerged({1});
    indexer.Commit();
  }
  EXPECT_THAT(AwaitErrors(), IsEmpty());
  ExpectMerged({2});
}

TEST_P(CatalogLocked, ForLongerFailsTheMerge) {
  {
    Tracer tracer(appliance.Daemon().Pid());
    EXPECT_EQ(5s, appliance.HandleUntilSlept(tracer, TranscodedBatch(b.Path()), 6s));
  }
  EXPECT_THAT(AwaitErrors(),
              ElementsAre(::testing::AllOf(StartsWith("Error that we will ignore "),
                                           ::testing::HasSubstr("database is locked"))));
  ExpectMerged({1});
  indexer.Commit();
  EXPECT_THAT(HandleForErrors(TranscodedBatch(b.Path())), IsEmpty());
  ExpectMerged({2});
}

INSTANTIATE_TEST_SUITE_P(In, CatalogLocked, ::testing::Values("delete"),
                         [](const auto& tested) { return std::string(tested.param); });

} // namespace
} // namespace orva::test
