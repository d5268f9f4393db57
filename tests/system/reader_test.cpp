#include "Catalog.h"
#include "Deadline.h"
#include "Expectations.h"
#include "Messages.h"
#include "Tracer.h"

#include "support/Program.h"
#include "support/Programs.h"
#include "support/TestScale.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <set>
#include <stdexcept>

namespace orva::test {
namespace {

/// Another program, which reads the rows of B in the merged database on A all the time.
class Reader {
public:
  /// Takes reads until one has seen `sight`. Throws std::runtime_error after the deadline.
  void Await(const std::string& sight) {
    const auto end = std::chrono::steady_clock::now() + DEADLINE;
    while (sights_.empty() || sights_.back() != sight) {
      if (!TakeOne() || std::chrono::steady_clock::now() > end) {
        throw std::runtime_error("the reader has not seen " + sight);
      }
    }
  }

  /// Ends the program, takes its last reads, and returns its status.
  int Stop() {
    program_.CloseInput();
    while (TakeOne()) {
    }
    return program_.WaitForEnd();
  }

  /// What the reads saw, in their order.
  const Lines& Sights() const { return sights_; }
  /// The longest wait of a read, in microseconds.
  long LongestWait() const { return longestWait_; }

private:
  bool TakeOne() {
    const std::string line = program_.ReadLine();
    if (line == "(deadline)") {
      throw std::runtime_error("the reader does not read");
    }
    if (line == "(end)") {
      return false;
    }
    const auto bar = line.find('|');
    longestWait_ = std::max(longestWait_, std::stol(line.substr(0, bar)));
    sights_.push_back(line.substr(bar + 1));
    return true;
  }

  Program program_{{ProgramPath("merged_reader"), "/shares/A", "/shares/B/"},
                   {.input = "", .errors = Program::Errors::Inherited}};
  Lines sights_;
  long longestWait_ = 0;
};

/// Merges of B into A while other programs read. B grows by folders of 500 photos, each with a
/// stamp of its own.
class Readers : public SystemTest {
protected:
  void SetUp() override {
    appliance.Start();
    for (const Volume* volume : {&a, &b}) {
      appliance.Handle(Plugged(volume->Path()));
    }
    appliance.Handle(Scanned(a.Path()));
  }

  void Grow(int photos) {
    catalog.Rows().Run("BEGIN");
    for (int added = 0; added < photos; added += PER_FOLDER) {
      const std::string folder = "Folder" + std::to_string(++folders) + "/";
      catalog.AddFolder(folder, 500);
      catalog.AddPhotos(folder, PER_FOLDER, folders);
    }
    catalog.Rows().Run("COMMIT");
  }

  void Merge() { appliance.Handle(TranscodedBatch(b.Path())); }

  /// What a reader sees after the merge of the whole catalog.
  std::string Whole() const {
    const std::string photos = std::to_string(folders * PER_FOLDER);
    return photos + "|0|" + std::to_string(folders + 1) + "|" + photos + "|" + photos + "|" +
           std::to_string(folders);
  }

  /// What a reader may see before a re-merge adds rows: first the time is reset, then there are no
  /// files, then no folders.
  std::set<std::string> SetBack() const {
    const std::string photos = std::to_string(folders * PER_FOLDER);
    const std::string rest = std::to_string(folders + 1) + "|" + photos + "|" + photos + "|0";
    return {photos + "|0|" + rest, "0|0|" + rest, "0|0|0|" + photos + "|" + photos + "|0"};
  }

  static constexpr int PER_FOLDER = 500;
  const Volume a{"A", "150g"};
  const Volume b{"B", "1g"};
  Catalog catalog{b};
  int folders = 0;
};

TEST_F(Readers, SeeOnlyCommittedData) {
  Grow(TestScale(10'000, 50'000));
  Merge();
  std::set<std::string> committed{Whole()};
  std::array<Reader, 2> readers;
  for (int i = 0; i < TestScale(10, 100); ++i) {
    const std::set<std::string> between = SetBack();
    Grow(1000);
    if (i % 5 == 4) {
      committed.insert(between.begin(), between.end());
      appliance.Handle(Purged(b.Path()));
    } else {
      Merge();
    }
    committed.insert(Whole());
    for (Reader& reader : readers) {
      reader.Await(Whole());
    }
  }
  std::size_t reads = 0;
  for (Reader& reader : readers) {
    EXPECT_EQ(Exited(0), reader.Stop());
    for (const std::string& sight : reader.Sights()) {
      ASSERT_TRUE(committed.contains(sight)) << sight;
    }
    reads += reader.Sights().size();
  }
  ReportFigure("reads by other programs during merges, none of half a merge",
               std::to_string(reads));
}

int Occurrences(const std::string& text, const std::string& part) {
  int count = 0;
  for (std::size_t at = 0; (at = text.find(part, at)) != std::string::npos; at += part.size()) {
    ++count;
  }
  return count;
}

/// The daemon is held before each of its effects, and a reader reads without waiting for locks.
TEST_F(Readers, WaitOnlyForTheCommit) {
  Grow(1000);
  Merge();
  const std::string before = Whole();
  constexpr int FILES = 10'000;
  Grow(FILES);
  const MergedDatabase reader(a.Path());
  reader.Rows().Run("PRAGMA busy_timeout = 0");
  const auto read = [&]() -> std::string {
    try {
      return reader.Rows().Run("SELECT (SELECT count(*) FROM Files) || '|0|' || (SELECT count(*) "
                               "FROM Folders WHERE volume = '/shares/B/'), photos_xcoded, "
                               "photos_total, last_updated_time FROM Statistics")[0];
    } catch (const std::runtime_error&) {
      return "locked";
    }
  };

  // The results of the reads in their order, each with the number of effects it lasted.
  std::vector<std::pair<std::string, int>> phases;
  int added = 0;
  int readsBetweenAdds = 0;
  bool merged = false;
  int lockedBeforeCommit = 0;
  {
    Tracer tracer(appliance.Daemon().Pid());
    appliance.Service().Send(TranscodedBatch(b.Path()));
    const std::string last = appliance.SendBarrier();
    std::string data;
    do {
      tracer.RunUntil([&](const SystemCall& call) {
        data = IsEffect(call) ? tracer.Data(call) : "";
        return IsEffect(call);
      });
      const std::string seen = read();
      if (phases.empty() || phases.back().first != seen) {
        phases.emplace_back(seen, 0);
      }
      ++phases.back().second;
      added += Occurrences(data, "Adding file ");
      readsBetweenAdds += added > 0 && added < FILES && seen == before ? 1 : 0;
      lockedBeforeCommit += !merged && seen == "locked" ? 1 : 0;
      merged = merged || data.find(" files for /shares/B/ in ") != std::string::npos;
    } while (data.find(last) == std::string::npos);
  }
  appliance.Barrier();
  EXPECT_EQ(FILES, added);
  EXPECT_GT(readsBetweenAdds, 10);
  EXPECT_EQ(0, lockedBeforeCommit);
  ASSERT_EQ(3U, phases.size());
  EXPECT_EQ(before, phases[0].first);
  EXPECT_EQ("locked", phases[1].first);
  EXPECT_EQ(Whole(), phases[2].first);
}

TEST_F(Readers, ReportTheirLongestWait) {
  Grow(1'000);
  for (const int photos : {1'000, 50'000}) {
    long longest = 0;
    for (int i = 0; i < TestScale(2, 10); ++i) {
      Merge();
      const std::string before = Whole();
      Grow(photos);
      Reader reader;
      reader.Await(before);
      Merge();
      reader.Await(Whole());
      EXPECT_EQ(Exited(0), reader.Stop());
      longest = std::max(longest, reader.LongestWait());
    }
    ReportFigure("longest wait of a reader in merges of " + std::to_string(photos) +
                     " files, microseconds",
                 std::to_string(longest));
  }
}

} // namespace
} // namespace orva::test
