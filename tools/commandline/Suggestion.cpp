#include "Suggestion.h"

#include <algorithm>
#include <cstddef>
#include <numeric>

namespace orva::commandline {

namespace {

/// No name is longer, so a longer word is not compared.
constexpr std::size_t LONGEST = 40;

/// The number of characters to insert, remove or replace to make one word of the other.
std::size_t Distance(const std::string& a, const std::string& b) {
  std::vector<std::size_t> row(b.size() + 1);
  std::iota(row.begin(), row.end(), 0U);
  for (const char character : a) {
    std::size_t diagonal = row[0]++;
    for (std::size_t j = 0; j < b.size(); ++j) {
      const std::size_t replaced = diagonal + (character == b[j] ? 0 : 1);
      diagonal = row[j + 1];
      row[j + 1] = std::min({replaced, row[j] + 1, diagonal + 1});
    }
  }
  return row.back();
}

} // namespace

std::optional<std::string> Suggest(const std::string& word, const std::vector<std::string>& names) {
  if (word.size() > LONGEST) {
    return std::nullopt;
  }
  std::optional<std::string> nearest;
  // At least half of the characters are right, and at most two are wrong.
  std::size_t limit = std::min<std::size_t>(2, word.size() / 2);
  for (const std::string& name : names) {
    const std::size_t distance =
        name.starts_with(word) && word.size() > 1 ? 1 : Distance(word, name);
    if (distance <= limit && (!nearest || distance < limit)) {
      nearest = name;
      limit = distance;
    }
  }
  return nearest;
}

std::string DidYouMean(const std::string& word, const std::vector<std::string>& names) {
  const auto suggestion = Suggest(word, names);
  return suggestion ? "; did you mean '" + *suggestion + "'?" : "";
}

} // namespace orva::commandline
