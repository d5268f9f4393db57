#include "HostileTest.h"

#include <sys/stat.h>

#include "Tree.h"
#include "WriteWatch.h"

#include "support/Programs.h"

#include "orvautil/FormatString.h"

#include <filesystem>
#include <fstream>

namespace orva::test {

namespace {

namespace fs = std::filesystem;

const std::string ERROR_BEGINNING = "Error that we will ignore ";
const int GOOD_FOLDERS = 3;

/// How much more memory than for the good volume an attempt may take for `content` bytes.
long long MemoryAllowance(long long content) {
  if (AreProgramsSanitized()) {
    return (1LL << 30U) + 256 * content;
  }
  // The merged database's page cache is 64 MiB of it.
  return (128LL << 20U) + 64 * content;
}

/// Whether a log ends with the lines of a successful merge of the good volume.
bool EndsWithGoodMerge(const Log& log, int files) {
  const Log good = MergeLines(GOOD, GOOD_FOLDERS, files);
  return log.size() >= good.size() &&
         std::equal(good.begin(), good.end(), log.end() - static_cast<long>(good.size()));
}

/// The rows of the good volume and of the daemon itself in a merged database. Without their ids,
/// which depend on the rows of other volumes.
Lines GoodContent(const std::string& location) {
  Lines content = MergedRows(location, "SELECT * FROM Status");
  for (const char* const sql :
       {"SELECT volume, photos_xcoded, photos_total, last_updated_time FROM Statistics WHERE "
        "volume = '/shares/Good/'",
        "SELECT name, modified_date, volume FROM Folders WHERE volume IN ('<DUMMY>', "
        "'/shares/Good/') ORDER BY 1",
        "SELECT o.name || f.name, f.modified_date, f.created_date FROM Files f LEFT JOIN Folders "
        "o ON o.folder_id = f.folder_id WHERE f.volume = '/shares/Good/' ORDER BY 1"}) {
    content = content + MergedRows(location, sql);
  }
  return content;
}

/// Rows that a merge of the hostile volume must not add.
Lines UnexpectedRows(const std::string& location) {
  return MergedRows(location,
                    "SELECT name, volume FROM Folders WHERE volume NOT IN ('<DUMMY>', "
                    "'/shares/Good/') AND (volume != '/shares/Vol/' OR substr(name, 1, 12) != "
                    "volume) UNION ALL SELECT name, volume FROM Files WHERE volume NOT IN "
                    "('/shares/Good/', '/shares/Vol/') UNION ALL SELECT volume, '' FROM Statistics "
                    "WHERE volume NOT IN ('/shares/Good/', '/shares/Vol/')");
}

} // namespace

HostileTest::HostileTest() {
  for (const std::string& directory : {MASTER, VOLUME, SPARE, DECOY}) {
    MakeDirectory(directory);
  }
  std::ofstream(VICTIM) << "content";
  std::ofstream("/tmp/victim") << "content";
  Catalog good(GOOD);
  AddPhotos(good);
  Attempt::Run({{"merge", MASTER, GOOD}});
  merged_ = Bytes::Of(MERGED);

  good.AddPhoto("a/new.jpg", 24, 400);
  usualMemory_ = Attempt::Run({{"merge", MASTER, GOOD}}).peakMemory;
  goodContent_ = GoodContent(MASTER);
  RestoreMaster();
  Logged();
}

HostileTest::~HostileTest() {
  if (attempts_ > 0) {
    const auto* const info = ::testing::UnitTest::GetInstance()->current_test_info();
    ReportFigure(std::string("hostile files, ") + info->name(),
                 util::FormatString("%d tried, longest %.2f s, most memory %lld MiB", attempts_,
                                    longest_, mostMemory_ >> 20U));
  }
}

HostileTest::Outcome HostileTest::MergeHostileVolume() {
  RestoreMaster();
  last_ = RunWatched({{"merge", MASTER, VOLUME}, {"merge", MASTER, GOOD}});
  const Attempt& attempt = last_;
  const Log log = Logged();
  if (!attempt.trouble.empty()) {
    return Outcome::Broken;
  }
  CheckMemory(attempt);
  EXPECT_THAT(attempt.thrown, ::testing::ElementsAre("", ""));
  EXPECT_TRUE(EndsWithGoodMerge(log, 1)) << ::testing::PrintToString(log);
  EXPECT_EQ(goodContent_, GoodContent(MASTER));
  EXPECT_THAT(UnexpectedRows(MASTER), ::testing::IsEmpty());
  EXPECT_THAT(MergedRows(MASTER, "PRAGMA integrity_check"), ::testing::ElementsAre("ok"));

  const Lines errors = ErrorTexts(log);
  refusal_ = errors.empty() ? "" : errors.front();
  if (errors.empty()) {
    EXPECT_EQ(10U, log.size());
    return ::testing::Test::HasFailure() ? Outcome::Broken : Outcome::Merged;
  }
  EXPECT_EQ(1U, errors.size()) << ::testing::PrintToString(errors);
  EXPECT_TRUE(refusal_.starts_with(ERROR_BEGINNING) && refusal_.ends_with('\n')) << refusal_;
  EXPECT_THAT(MergedRows(MASTER, "SELECT volume FROM Statistics"),
              ::testing::ElementsAre("/shares/Good/"));
  EXPECT_THAT(MergedRows(MASTER, "SELECT count(*) FROM Folders WHERE volume = '/shares/Vol/'"),
              ::testing::ElementsAre("0"));
  return ::testing::Test::HasFailure() ? Outcome::Broken : Outcome::Refused;
}

std::vector<std::string> HostileTest::UseHostileMaster() {
  const Attempt attempt = RunWatched({{"init", MASTER},
                                      {"merge", MASTER, GOOD},
                                      {"remerge", MASTER, GOOD},
                                      {"remove", MASTER, GOOD},
                                      {"locate", MASTER},
                                      {"merge", SPARE, GOOD}});
  const Log log = Logged();
  if (!attempt.trouble.empty()) {
    return {attempt.trouble};
  }
  CheckMemory(attempt);
  EXPECT_EQ("", attempt.thrown.at(5));
  EXPECT_TRUE(EndsWithGoodMerge(log, 4)) << ::testing::PrintToString(log);
  EXPECT_THAT(MergedStatistics(SPARE), ::testing::ElementsAre("/shares/Good/|4|4|400"));
  for (const std::string& error : ErrorTexts(log)) {
    EXPECT_TRUE(error.starts_with(ERROR_BEGINNING) || error.starts_with("Could not ")) << error;
  }
  fs::remove_all(SPARE + ".zophotos");
  if (locatorIsFree_) {
    fs::remove(LOCATOR_PATH);
  }

  return ErrorTexts(log) + attempt.thrown;
}

void HostileTest::RestoreMaster() const {
  for (const char* const suffix : {"-journal", "-wal", "-shm"}) {
    fs::remove(MERGED + suffix);
  }
  merged_.Save(MERGED);
}

bool HostileTest::MayChange(const std::string& path) const {
  const auto isOf = [&](const std::string& directory, const std::string& name) {
    return path == directory || path + "/" == directory || path.starts_with(directory + name);
  };
  return path == "/tmp" || path == "/shares" || isOf(MASTER + ".zophotos/", "zophotos.db") ||
         isOf(SPARE, ".zophotos") || (locatorIsFree_ && path == LOCATOR_PATH) ||
         (catalogHasWal &&
          (path == VOLUME + ".orva" || path == CATALOG + "-wal" || path == CATALOG + "-shm"));
}

Attempt HostileTest::RunWatched(const std::vector<Operation>& operations) {
  locatorIsFree_ = !fs::exists(fs::symlink_status(LOCATOR_PATH));
  const auto except = [this](const std::string& path) { return MayChange(path); };
  const Tree before = Tree::Of({"/shares", "/tmp"}, except);
  WriteWatch watch("/shares", except);
  Attempt attempt = Attempt::Run(operations, environment, deadline);
  EXPECT_EQ("", attempt.trouble);
  EXPECT_THAT(watch.Take(), ::testing::IsEmpty());
  EXPECT_THAT(Tree::Of({"/shares", "/tmp"}, except).ChangesSince(before), ::testing::IsEmpty());
  ++attempts_;
  longest_ = std::max(longest_, attempt.seconds);
  mostMemory_ = std::max(mostMemory_, attempt.peakMemory);
  return attempt;
}

void HostileTest::CheckMemory(const Attempt& attempt) const {
  const long long content = BytesOnMedium(VOLUME) + BytesOnMedium(MASTER);
  EXPECT_LE(attempt.peakMemory, usualMemory_ + MemoryAllowance(content))
      << content << " bytes are on the volume";
}

void AddPhotos(Catalog& catalog) {
  catalog.AddFolder("a/", 11);
  catalog.AddFolder("a/b/", 12);
  catalog.AddPhoto("top.jpg", 21, 100);
  catalog.AddPhoto("a/one.jpg", 22, 300);
  catalog.AddPhoto("a/b/two.jpg", 23, 200);
}

void MakeCatalogFolder() {
  MakeDirectory(core::GetORVA_HOME(VOLUME));
}

long long BytesOnMedium(const std::string& path) {
  long long bytes = 0;
  for (const auto& entry : fs::recursive_directory_iterator(path)) {
    struct stat status {};
    if (lstat(entry.path().c_str(), &status) == 0 && S_ISREG(status.st_mode)) {
      bytes += static_cast<long long>(status.st_blocks) * 512;
    }
  }
  return bytes;
}

std::uint32_t RootPage(const std::string& database, const std::string& name) {
  return static_cast<std::uint32_t>(std::stoul(
      Database(database).Run("SELECT rootpage FROM sqlite_schema WHERE name = ?", {name}).at(0)));
}

void Mutate(Bytes& file, std::size_t pageSize, std::mt19937& random) {
  const auto below = [&](std::size_t end) {
    return std::uniform_int_distribution<std::size_t>(0, end - 1)(random);
  };
  const std::size_t changes = 1 + below(8);
  for (std::size_t i = 0; i < changes; ++i) {
    constexpr std::size_t headOfPage = 120;
    const std::size_t page = below(file.Size() / pageSize) * pageSize;
    const std::size_t offset = page + below(below(2) == 0 ? headOfPage : pageSize);
    file[offset] = static_cast<std::uint8_t>(below(256));
  }
}

std::string ExpensiveValue(const std::string& term) {
  return "instr(hex(zeroblob(500000)), hex(zeroblob(200000)) || " + term +
         " || hex(zeroblob(200000)))";
}

std::string Rows(int count) {
  return "WITH RECURSIVE n(x) AS (SELECT 1 UNION ALL SELECT x + 1 FROM n WHERE x < " +
         std::to_string(count) + ") ";
}

} // namespace orva::test
