#pragma once

#include <cstdint>
#include <set>
#include <string>
#include <vector>

namespace orva::test {

/// A feed that zophotos printed.
struct ParsedFeed {
  /// Splits the output of an export of changes. Throws std::runtime_error if it is no feed.
  explicit ParsedFeed(const std::string& output);

  struct Row {
    int sign;
    std::string text; ///< the line of the same photo in an export
  };

  bool isComplete = false;
  bool isWhole = false;
  std::string id;
  std::string previous;
  std::uint64_t number = 0;
  std::uint64_t photos = 0; ///< that the reader has then
  std::vector<Row> rows;
};

/// A program that applies feeds, as zophotos(1) describes it.
class FeedReader {
public:
  enum class Result { Applied, Repeated, Incomplete, Missed };

  /// Applies a feed, if it is the next one.
  Result Take(const std::string& output);

  /// What an export prints for these photos, in sorted lines.
  const std::multiset<std::string>& Photos() const { return photos_; }

private:
  std::string last_; ///< id of the last feed
  std::multiset<std::string> photos_;
};

/// The lines of an export as FeedReader has them.
std::multiset<std::string> PhotosOfExport(const std::string& output);

} // namespace orva::test
