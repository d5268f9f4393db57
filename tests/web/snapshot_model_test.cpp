// Random changes of the merged database. After each, the snapshot is the same as one that is built
// from the beginning, and finds what a search through all paths finds.

#include "SnapshotTest.h"

#include "endurance/Random.h"

#include "zophotos-web/SearchIndex.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <ctime>
#include <map>
#include <sstream>

namespace orva::test {
namespace {

/// The words of a text.
std::vector<std::string> WordsOf(const std::string& text) {
  std::string words;
  web::AppendWords(text, words);
  std::istringstream stream(words);
  std::vector<std::string> result;
  for (std::string word; stream >> word;) {
    result.push_back(word);
  }
  return result;
}

/// Whether the path has words that begin with all the words of `search`. A text without a word
/// finds nothing.
bool Matches(const web::Photo& photo, const std::string& search) {
  const std::vector<std::string> words = WordsOf(photo.path);
  const std::vector<std::string> searched = WordsOf(search);
  return (!searched.empty() || search.empty()) &&
         std::ranges::all_of(searched, [&](const std::string& wanted) {
           return std::ranges::any_of(
               words, [&](const std::string& word) { return word.starts_with(wanted); });
         });
}

class RandomChanges : public SnapshotTest, public ::testing::WithParamInterface<int> {
protected:
  struct Entry {
    std::string path;
    std::string volume;
  };

  void SetUp() override {
    merged_.emplace(path_);
    Start();
  }

  /// One to five changes, in one transaction.
  void Change() {
    if (random_.Chance(3)) {
      ElectMaster();
    }
    merged_->Run("BEGIN");
    for (std::size_t count = 1 + random_.Below(5); count > 0; --count) {
      ChangeOnce();
    }
    merged_->Run("COMMIT");
  }

  void ChangeOnce() {
    const std::size_t kind = random_.Below(100);
    if (folders_.empty() || kind < 4) {
      AddVolume();
    } else if (kind < 20) {
      AddFolder();
    } else if (kind < 70) {
      AddFiles();
    } else if (kind < 85) {
      RemoveFile();
    } else if (kind < 92) {
      RemoveFolder();
    } else if (kind < 95) {
      RemoveVolume();
    } else if (kind < 96) {
      Clear();
    } else {
      merged_->Run(
          "UPDATE Statistics SET photos_xcoded = photos_xcoded + 1, last_updated_time = 7");
    }
  }

  std::string Word() {
    return random_.Of<std::string>({"IMG", "Été", "holiday", "Holidays", "2019", "20190101", "rome",
                                    "0001", "東京", "<b>", "x\xFFy", "DSC1", "a", "Straße", "--"});
  }

  void AddVolume() {
    const std::string volume =
        random_.Of<std::string>({"/shares/A/", "/shares/B/", "/shares/Photos/"});
    if (std::ranges::any_of(folders_, [&](const auto& f) { return f.second.path == volume; })) {
      return;
    }
    folders_[merged_->AddVolume(volume)] = {volume, volume};
  }

  void AddFolder() {
    const auto parent = AnyFolder();
    const std::string path = parent->second.path + Word() + std::to_string(random_.Below(50)) + "/";
    if (std::ranges::none_of(folders_, [&](const auto& f) { return f.second.path == path; })) {
      const std::string volume = parent->second.volume;
      folders_[merged_->AddFolder(parent->first, path, volume)] = {path, volume};
    }
  }

  void AddFiles() {
    const auto folder = AnyFolder();
    for (std::size_t count = 1 + random_.Below(30); count > 0; --count) {
      const std::int64_t time = static_cast<std::int64_t>(random_.Below(1'600'000'000)) -
                                static_cast<std::int64_t>(random_.Chance(5) ? 1'500'000'000 : 0);
      merged_->AddFile(folder->first, Word() + "_" + std::to_string(random_.Below(1000)) + ".jpg",
                       random_.Chance(20) ? 1000 : time, folder->second.volume);
    }
  }

  void RemoveFile() {
    merged_->Run(
        "DELETE FROM Files WHERE file_id IN (SELECT file_id FROM Files ORDER BY (file_id * "
        "7919) % 1009 LIMIT ?)",
        {std::to_string(1 + random_.Below(10))});
  }

  void RemoveFolder() {
    const auto folder = AnyFolder();
    if (folder->second.path == folder->second.volume) {
      return;
    }
    merged_->Run("DELETE FROM Files WHERE folder_id = ?", {std::to_string(folder->first)});
    merged_->Run("DELETE FROM Folders WHERE folder_id = ?", {std::to_string(folder->first)});
    folders_.erase(folder);
  }

  void RemoveVolume() {
    const std::string volume = AnyFolder()->second.volume;
    merged_->Run("DELETE FROM Folders WHERE volume = ?", {volume});
    merged_->Run("DELETE FROM Files WHERE volume = ?", {volume});
    merged_->Run("UPDATE Statistics SET last_updated_time = 0 WHERE volume = ?", {volume});
    std::erase_if(folders_, [&](const auto& folder) { return folder.second.volume == volume; });
  }

  void Clear() {
    merged_->Run("DELETE FROM Folders WHERE folder_id != 1");
    merged_->Run("DELETE FROM Files");
    merged_->Run("DELETE FROM Statistics");
    folders_.clear();
  }

  void ElectMaster() {
    path_ = "/tmp/master-" + std::to_string(++masters_) + "/zophotos.db";
    merged_.emplace(path_);
    folders_.clear();
  }

  std::map<std::int64_t, Entry>::iterator AnyFolder() {
    return std::next(folders_.begin(), static_cast<std::ptrdiff_t>(random_.Below(folders_.size())));
  }

  /// Compares a random filter with a look at all photos.
  void CheckFilter(const std::vector<web::Photo>& all) {
    web::Filter filter;
    if (random_.Chance(70)) {
      filter.words = Word().substr(0, 1 + random_.Below(6));
      if (random_.Chance(40)) {
        filter.words += " " + Word();
      }
    }
    if (random_.Chance(30)) {
      filter.volume = random_.Of<std::string>({"/shares/A/", "/shares/B/", "/shares/None/"});
    }
    if (random_.Chance(20) && !folders_.empty()) {
      filter.folder = AnyFolder()->first;
    }
    if (random_.Chance(30)) {
      const auto first = static_cast<std::int64_t>(random_.Below(1'600'000'000));
      filter.times = {first, first + static_cast<std::int64_t>(random_.Below(1'000'000'000))};
    }
    std::vector<web::Photo> expected;
    std::ranges::copy_if(all, std::back_inserter(expected), [&](const web::Photo& photo) {
      return Matches(photo, filter.words) && (!filter.volume || photo.volume == *filter.volume) &&
             (!filter.folder || photo.folder == *filter.folder) &&
             (!filter.times ||
              (photo.modified >= filter.times->first && photo.modified <= filter.times->second));
    });
    const std::size_t count = 1 + random_.Below(20);
    std::optional<web::PhotoId> before;
    for (std::size_t begin = 0; begin <= expected.size(); begin += count) {
      const auto page = reader_->Photos(filter, before, count);
      const std::size_t size = std::min(count, expected.size() - begin);
      const auto first = expected.begin() + static_cast<std::ptrdiff_t>(begin);
      ASSERT_EQ(page, std::vector<web::Photo>(first, first + static_cast<std::ptrdiff_t>(size)))
          << "words '" << filter.words << "'";
      if (page.empty()) {
        break;
      }
      if (begin != 0) {
        ASSERT_EQ(reader_->PhotosAfter(filter, page.front().id, 1).at(0), expected[begin - 1]);
      }
      before = page.back().id;
    }
  }

  void CheckMonths(const std::vector<web::Photo>& all) {
    std::vector<web::Month> expected;
    for (const web::Photo& photo : all) {
      const std::time_t time = photo.modified;
      std::tm fields{};
      localtime_r(&time, &fields);
      const web::Month month{fields.tm_year + 1900, fields.tm_mon + 1};
      if (expected.empty() || expected.back() != month) {
        expected.push_back(month);
      }
    }
    ASSERT_EQ(reader_->Months({}), expected);
  }

  Random random_{static_cast<std::uint64_t>(GetParam())};
  std::optional<MergedFile> merged_;
  std::map<std::int64_t, Entry> folders_;
  int masters_ = 0;
};

TEST_P(RandomChanges, AreFollowedExactly) {
  for (int round = 0; round < 60; ++round) {
    const Shown before = ReadAll(*snapshot_);
    Change();
    const bool hasChanged = Update();
    ASSERT_EQ(snapshot_->Status().state, web::SnapshotStatus::State::Current)
        << snapshot_->Status().reason;
    const Shown shown = ReadAll(*snapshot_);
    ASSERT_EQ(shown, ReadAll(*BuildAnother())) << "round " << round;
    ASSERT_EQ(shown.photos.size(),
              static_cast<std::size_t>(merged_->Number("SELECT count(*) FROM Files")));
    ASSERT_EQ(shown.folders.size(),
              static_cast<std::size_t>(merged_->Number("SELECT count(*) FROM Folders")));
    ASSERT_EQ(hasChanged, shown != before || round == 0);
    for (int i = 0; i < 10; ++i) {
      CheckFilter(shown.photos);
    }
    CheckMonths(shown.photos);
    if (HasFatalFailure()) {
      FAIL() << "round " << round;
    }
    if (random_.Chance(5)) {
      Start(); // as after a restart of the program
      Update();
      ASSERT_EQ(ReadAll(*snapshot_), shown);
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomChanges, ::testing::Range(1, 9));

/// Enough photos for frequent prefixes.
TEST_F(SnapshotTest, PrefixesThatManyPhotosHaveFindExactlyThese) {
  constexpr int photos = 40'000;
  MergedFile merged(MERGED);
  const std::int64_t folder = merged.AddFolder(1, "/shares/A/", "/shares/A/");
  const auto name = [](int i) {
    return (i % 3 == 0 ? "IMG_" : "Ink ") + std::to_string(i % 10 == 0 ? i + 1'000'000 : i) +
           ".jpg";
  };
  const auto add = [&](int begin, int end) {
    merged.Run("BEGIN");
    for (int i = begin; i < end; ++i) {
      merged.AddFile(folder, name(i), (i * 7919L) % 1'000'000, "/shares/A/");
    }
    merged.Run("COMMIT");
  };
  add(0, photos);
  Start();
  Update();
  const auto check = [&] {
    std::vector<web::Photo> all;
    for (auto page = reader_->Photos({}, std::nullopt, 1000); !page.empty();
         page = reader_->Photos({}, page.back().id, 1000)) {
      all.insert(all.end(), page.begin(), page.end());
    }
    for (const char* const words : {"1", "10", "100", "i", "im", "in", "2", "39", "1 img",
                                    "ink 1 10", "1000", "j", "9", "99", "4000", "in 1"}) {
      std::vector<web::Photo> expected;
      for (const web::Photo& photo : all) {
        if (expected.size() < 1000 && Matches(photo, words)) {
          expected.push_back(photo);
        }
      }
      EXPECT_EQ(reader_->Photos(WithWords(words), std::nullopt, 1000), expected) << words;
    }
  };
  check();
  merged.Run("DELETE FROM Files WHERE file_id % 17 = 0");
  add(photos, photos + 1'000);
  Update();
  check();
}

} // namespace
} // namespace orva::test
