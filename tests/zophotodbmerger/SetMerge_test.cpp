// SetMerge gives the same rows with the same ids, and the same lines, as the operations of PhotoDB
// on single rows.

#include "SetMerge.h"

#include "CapturedOutput.h"
#include "Database.h"
#include "PhotoDB.h"
#include "SetMergeCase.h"

#include "orvadb/Statement.h"
#include "orvadb/Transaction.h"

#include "support/TestScale.h"

#include <gtest/gtest.h>
#include <sqlite3.h>

#include <atomic>
#include <filesystem>
#include <string>
#include <vector>

namespace orva::test {
namespace {

using dbmerger::MergeList;
using dbmerger::PhotoDB;
using dbmerger::SetMerge;

/// Expects no difference in random cases.
void CompareRandomMerges(unsigned count, std::size_t scale) {
  for (unsigned seed = 1; seed <= count; ++seed) {
    const MergeCase merge = MakeMergeCase(seed, scale);
    if (!CompareMerges(merge).empty()) {
      const MergeCase reduced = Reduce(merge);
      FAIL() << "seed " << seed << ", reduced:\n" << Describe(reduced) << CompareMerges(reduced);
    }
  }
}

TEST(SetMergeTest, RandomMergesGiveTheSameRowsAndLines) {
  CompareRandomMerges(TestScale(4'000U, 20'000U), 1);
}

TEST(SetMergeTest, LargerRandomMergesGiveTheSameRowsAndLines) {
  CompareRandomMerges(TestScale(60U, 2'000U), 15);
}

TEST(SetMergeTest, StoppedMergesHaveAppliedTheFirstRows) {
  MiddleStops stops;
  const unsigned count = TestScale(150U, 2'000U);
  for (unsigned seed = 1; seed <= count; ++seed) {
    const MergeCase merge = MakeMergeCase(seed);
    try {
      const std::string difference = CompareStoppedMerges(merge, stops);
      ASSERT_EQ("", difference) << "seed " << seed << "\n" << Describe(merge);
    } catch (const std::string& /*refusal*/) {
      continue;
    }
  }
  EXPECT_LT(5, stops.folders);
  EXPECT_LT(5, stops.files);
}

// What the random cases seldom have.

const std::string VOLUME_A = "/shares/A/";

CatalogRow File(const std::string& folder, const std::string& name, bool isDeleted = false) {
  return {.path = folder + name, .name = name, .isDeleted = isDeleted};
}

/// Expects no difference for merges into a database with these rows.
void Compare(const std::vector<std::string>& rows, const std::vector<CatalogMerge>& merges) {
  MergeCase merge{.database = OwnSchema()};
  merge.database.insert(merge.database.end(), rows.begin(), rows.end());
  for (const CatalogMerge& each : merges) {
    merge.transactions.push_back({.merges = {each}});
  }
  EXPECT_EQ("", CompareMerges(merge)) << Describe(merge);
}

TEST(SetMergeTest, RemovalWithoutAFolderRemovesFromAFolderWithTheIdThatStandsForIt) {
  Compare({"INSERT INTO Folders VALUES(-1, 1, '/shares/A/b/', 0, '/shares/B/'), (2, 1, "
           "'/shares/A/b/', 0, '/shares/A/')",
           "INSERT INTO Files VALUES(1, -1, 'n', 0, '/shares/A/', 0), (2, -1, 'm', 0, "
           "'/shares/A/', 0)"},
          {{.volume = VOLUME_A,
            .files = {File("/shares/A/a/", "m", true), File("/shares/A/a/", "n", true),
                      File("/shares/A/b/", "m"), File("/shares/A/b/", "n")}}});
}

TEST(SetMergeTest, FolderStoredUnderAVolumeOfBytesIsNotOnTheVolume) {
  Compare({"INSERT INTO Folders VALUES(5, 1, '/shares/A/a/', 1, CAST('/shares/A/' AS BLOB))"},
          {{.volume = VOLUME_A, .files = {File("/shares/A/a/", "n")}}});
}

TEST(SetMergeTest, NewFolderMayGetTheIdThatStandsForNone) {
  Compare({"INSERT INTO Folders VALUES(-2, 1, '/shares/A/b/', 1, '/shares/A/')",
           "UPDATE sqlite_sequence SET seq = -5"},
          {{.volume = VOLUME_A,
            .folders = {{.path = "/shares/A/b/c/"}, {.path = "/shares/A/b/c/d/"}}}});
}

TEST(SetMergeTest, NewFolderMayGetTheIdOfARemovedOne) {
  const CatalogRow folder{.path = "/shares/A/b/"};
  const CatalogRow removed{.path = "/shares/A/b/", .isDeleted = true};
  for (const char* const change :
       {"DELETE FROM sqlite_sequence", "UPDATE sqlite_sequence SET seq = 1"}) {
    Compare({"INSERT INTO Folders VALUES(1, -1, '/shares/A/', 1, '/shares/A/'), (2, 1, "
             "'/shares/A/b/', 1, '/shares/A/')",
             change},
            {{.volume = VOLUME_A,
              .folders = {removed, folder, folder, removed, folder, removed, removed, folder}}});
  }
}

/// What SQLite has done for a merge.
struct Cost {
  int statements = 0;
  long long steps = 0; ///< of SQLite's virtual machine
};

/// A new database whose statements are counted.
class CountedPhotoDB : public PhotoDB {
public:
  CountedPhotoDB() : PhotoDB(MakeLocation()) {
    Init();
    sqlite3_trace_v2(Handle(), SQLITE_TRACE_PROFILE, &Count, &cost_);
  }

  /// Merges in a transaction. Returns what that has cost.
  Cost Merge(const CatalogMerge& merge) {
    const std::atomic<bool> stopRequested{false};
    const MergeList folders = MakeMergeList(merge.folders);
    const MergeList files = MakeMergeList(merge.files);
    const CapturedOutput output;
    db::Transaction transaction(*this, 1'000);
    cost_ = {};
    {
      const SetMerge sets(*this, merge.volume, stopRequested);
      sets.ApplyFolders(folders);
      sets.ApplyFiles(files, merge.since);
    }
    const Cost cost = cost_;
    transaction.Commit();
    return cost;
  }

  void Run(const std::string& sql) const { db::Statement(*this, sql.c_str()).Execute(); }

  long long CountFiles() const {
    db::Statement query(*this, "SELECT count(*) FROM Files");
    query.Fetch();
    return query.GetInt64(0);
  }

private:
  static const char* MakeLocation() {
    const char* const location = "/tmp/counted";
    std::filesystem::remove_all(location);
    std::filesystem::create_directories(location);
    return location;
  }

  static int Count(unsigned /*event*/, void* cost, void* statement, void* /*nanoseconds*/) {
    ++static_cast<Cost*>(cost)->statements;
    static_cast<Cost*>(cost)->steps +=
        sqlite3_stmt_status(static_cast<sqlite3_stmt*>(statement), SQLITE_STMTSTATUS_VM_STEP, 1);
    return 0;
  }

  Cost cost_;
};

TEST(SetMergeTest, RowsThatOthersAddBetweenTransactionsAreSeen) {
  CountedPhotoDB photos;
  photos.Merge(
      {.volume = VOLUME_A, .folders = {{.path = VOLUME_A}}, .files = {File(VOLUME_A, "a")}});
  Database(photos.GetPath())
      .Run("INSERT INTO Files(folder_id, name, modified_date, volume, created_date) VALUES(2, 'b', "
           "0, '/shares/A/', 0)");
  photos.Merge({.volume = VOLUME_A,
                .files = {File(VOLUME_A, "a"), File(VOLUME_A, "b"), File(VOLUME_A, "c")}});
  EXPECT_EQ(3, photos.CountFiles());
}

std::string Numbered(const std::string& text, int number) {
  return text + std::to_string(10'000 + number);
}

/// Folders that all have files of the same names, as cameras give them.
CatalogMerge Camera(int folders, int files, bool areDeleted = false) {
  CatalogMerge merge{.volume = VOLUME_A, .folders = {{.path = VOLUME_A}}};
  for (int folder = 0; folder < folders; ++folder) {
    const std::string path = VOLUME_A + Numbered("", folder) + "/";
    merge.folders.push_back({.path = path});
    for (int file = 0; file < files; ++file) {
      merge.files.push_back(File(path, Numbered("IMG_", file), areDeleted));
    }
  }
  return merge;
}

CatalogMerge Flat(int begin, int end, int step = 1, bool areDeleted = false) {
  CatalogMerge merge{.volume = VOLUME_A, .folders = {{.path = VOLUME_A}}};
  for (int file = begin; file < end; file += step) {
    merge.files.push_back(File(VOLUME_A, Numbered("p", file), areDeleted));
  }
  return merge;
}

constexpr int SMALL = 250;
constexpr int LARGE = 4 * SMALL;

/// Expects that four times the rows cost at most little more than four times as much.
template <typename Measure>
void ExpectProportionalCost(Measure measure) {
  const Cost small = measure(SMALL);
  const Cost large = measure(LARGE);
  EXPECT_LT(0, small.steps);
  EXPECT_LE(large.steps, small.steps * 5);
  EXPECT_LE(large.statements, small.statements * 5);
}

TEST(SetMergeCostTest, FilesOfAFolderAreAddedByAFixedNumberOfStatements) {
  const auto measure = [](int count) {
    CountedPhotoDB photos;
    photos.Merge(Flat(0, 5));
    const Cost cost = photos.Merge(Flat(5, count));
    EXPECT_EQ(count, photos.CountFiles());
    return cost;
  };
  ExpectProportionalCost(measure);
  EXPECT_EQ(measure(SMALL).statements, measure(LARGE).statements);
}

TEST(SetMergeCostTest, RemovedFilesOfAFolderCostInProportion) {
  ExpectProportionalCost([](int count) {
    CountedPhotoDB photos;
    photos.Merge(Flat(0, 2 * count));
    const Cost cost = photos.Merge(Flat(0, 2 * count, 2, true));
    EXPECT_EQ(count, photos.CountFiles());
    return cost;
  });
}

TEST(SetMergeCostTest, FoldersAreAddedByAFixedNumberOfStatements) {
  const auto measure = [](int count) {
    CountedPhotoDB photos;
    return photos.Merge(Camera(count, 0));
  };
  ExpectProportionalCost(measure);
  EXPECT_EQ(measure(SMALL).statements, measure(LARGE).statements);
}

TEST(SetMergeCostTest, FewFilesOfALargeFolderDoNotCostMoreThanOfASmallOne) {
  for (const bool areDeleted : {false, true}) {
    const auto measure = [&](int count) {
      CountedPhotoDB photos;
      photos.Merge(Flat(0, count));
      return photos.Merge(Flat(7, 10, 1, areDeleted)).steps;
    };
    EXPECT_LE(measure(LARGE), measure(SMALL) * 11 / 10);
  }
}

TEST(SetMergeCostTest, FewFilesWithCommonNamesDoNotCostMoreWhereThereAreMoreFolders) {
  for (const bool areDeleted : {false, true}) {
    const auto measure = [&](int count) {
      CountedPhotoDB photos;
      photos.Merge(Camera(count, 3));
      CatalogMerge merge{.volume = VOLUME_A};
      for (int file = 0; file < 3; ++file) {
        merge.files.push_back(
            File(VOLUME_A + Numbered("", 5) + "/", Numbered("IMG_", file), areDeleted));
      }
      const Cost cost = photos.Merge(merge);
      EXPECT_EQ(3 * count - (areDeleted ? 3 : 0), photos.CountFiles());
      return cost.steps;
    };
    EXPECT_LE(measure(LARGE), measure(SMALL) * 11 / 10);
  }
}

TEST(SetMergeCostTest, NameThatAllFoldersHaveCostsInProportion) {
  for (const bool areDeleted : {false, true}) {
    ExpectProportionalCost([&](int count) {
      CountedPhotoDB photos;
      photos.Merge(Camera(count, 1));
      const Cost cost = photos.Merge(Camera(count, 1, areDeleted));
      EXPECT_EQ(areDeleted ? 0 : count, photos.CountFiles());
      return cost;
    });
  }
}

TEST(SetMergeCostTest, NamesThatAllFoldersShareCostInProportion) {
  for (const bool areDeleted : {false, true}) {
    ExpectProportionalCost([&](int count) {
      CountedPhotoDB photos;
      photos.Merge(Camera(count / 10, 40));
      const Cost cost = photos.Merge(Camera(count / 10, 60, areDeleted));
      EXPECT_EQ(areDeleted ? 0 : count / 10 * 60, photos.CountFiles());
      return cost;
    });
  }
}

TEST(SetMergeCostTest, OtherVolumesWithTheSameNamesCostInProportion) {
  ExpectProportionalCost([](int count) {
    CountedPhotoDB photos;
    photos.Merge(Camera(count, 1));
    CatalogMerge merge{.volume = "/shares/B/", .folders = {{.path = "/shares/B/"}}};
    for (int file = 0; file < count; ++file) {
      merge.files.push_back(File("/shares/B/", Numbered("IMG_", file % 2 == 0 ? 0 : file)));
    }
    return photos.Merge(merge);
  });
}

TEST(SetMergeCostTest, PathThatIsAddedAndRemovedInTurnsCostsInProportion) {
  ExpectProportionalCost([](int count) {
    CountedPhotoDB photos;
    photos.Merge(Flat(0, count));
    CatalogMerge merge{.volume = VOLUME_A};
    for (int turn = 0; turn < count; ++turn) {
      merge.files.push_back(File(VOLUME_A, "p", turn % 2 != 0));
      merge.folders.push_back({.path = VOLUME_A + "f/", .isDeleted = turn % 2 != 0});
    }
    return photos.Merge(merge);
  });
}

TEST(SetMergeCostTest, RemovalsOfOneFolderCostInProportion) {
  ExpectProportionalCost([](int count) {
    CountedPhotoDB photos;
    photos.Merge(Flat(0, count));
    CatalogMerge merge{.volume = VOLUME_A};
    for (int turn = 0; turn < count; ++turn) {
      merge.folders.push_back({.path = VOLUME_A, .isDeleted = true});
    }
    const Cost cost = photos.Merge(merge);
    EXPECT_EQ(0, photos.CountFiles());
    return cost;
  });
}

TEST(SetMergeCostTest, RemovedFoldersCostInProportionWithAnIndexOfAnotherProgram) {
  ExpectProportionalCost([](int count) {
    CountedPhotoDB photos;
    CatalogMerge merge = Camera(count, 1);
    photos.Merge(merge);
    photos.Run("CREATE INDEX volumes ON Folders(volume)");
    for (CatalogRow& folder : merge.folders) {
      folder.isDeleted = true;
    }
    const Cost cost = photos.Merge({.volume = VOLUME_A, .folders = merge.folders});
    EXPECT_EQ(0, photos.CountFiles());
    return cost;
  });
}

TEST(SetMergeCostTest, StatisticsOfTheDatabaseDoNotMakeRemovalsExpensive) {
  const auto measure = [](int count) {
    CountedPhotoDB photos;
    photos.Merge(Flat(0, count));
    photos.Run("ANALYZE");
    photos.Run("DELETE FROM sqlite_stat1");
    photos.Run("INSERT INTO sqlite_stat1 VALUES('Files', 'Files_folderId', '1000000 1000000'), "
               "('Folders', 'Folders_path', '1000000 1000000')");
    photos.Run("ANALYZE sqlite_schema");
    return photos.Merge(
        {.volume = VOLUME_A, .folders = {{.path = VOLUME_A + "none/", .isDeleted = true}}});
  };
  EXPECT_LE(measure(LARGE).steps, measure(SMALL).steps * 11 / 10);
}

TEST(SetMergeCostTest, ManyRowsOfOneFolderCostInProportion) {
  for (const bool areDeleted : {false, true}) {
    ExpectProportionalCost([&](int count) {
      CountedPhotoDB photos;
      photos.Merge(Flat(0, count));
      photos.Run(
          "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < " +
          std::to_string(count) +
          ") INSERT INTO Folders(parent_folder_id, name, modified_date, volume) SELECT 1, '" +
          VOLUME_A + "', 0, iif(i % 2, '" + VOLUME_A + "', '/shares/B/') FROM n");
      photos.Run("INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT "
                 "folder_id, 'p10001', 0, volume, 0 FROM Folders");
      CatalogMerge merge = Flat(0, count, 1, areDeleted);
      for (int turn = 0; turn < count; ++turn) {
        merge.folders.push_back({.path = VOLUME_A, .isDeleted = areDeleted});
      }
      return photos.Merge(merge);
    });
  }
}

} // namespace
} // namespace orva::test
