#include "Query.h"

#include "SearchIndex.h"

#include <algorithm>
#include <array>
#include <ctime>
#include <string_view>
#include <utility>

namespace orva::web {
namespace {

constexpr std::size_t YEAR_DIGITS = 4;
constexpr int LAST_YEAR = 9999;
constexpr int MONTHS_PER_YEAR = 12;

/// The value of a parameter; empty if it is missing.
std::string_view ValueOf(const Target& target, const char* name) {
  const std::string* const value = target.Find(name);
  return value == nullptr ? std::string_view() : std::string_view(*value);
}

std::optional<int> ParseDigits(std::string_view text, std::size_t digits, int least, int most) {
  const auto isDigit = [](char c) { return c >= '0' && c <= '9'; };
  if (text.size() != digits || !std::ranges::all_of(text, isDigit)) {
    return std::nullopt;
  }
  const int number = std::stoi(std::string(text));
  return number >= least && number <= most ? std::optional(number) : std::nullopt;
}

/// Reads "2026-11" or "2026".
void ParseMonth(std::string_view text, Selection& selection) {
  selection.year = ParseDigits(text.substr(0, YEAR_DIGITS), YEAR_DIGITS, 1, LAST_YEAR);
  const std::string_view rest = text.substr(std::min(YEAR_DIGITS, text.size()));
  if (rest.starts_with('-')) {
    selection.month = ParseDigits(rest.substr(1), 2, 1, MONTHS_PER_YEAR);
  }
  if (!selection.year || (!rest.empty() && !selection.month)) {
    throw BadQuery("A month is written as 2026-11, or 2026 for the whole year.");
  }
}

/// Reads the conditions "month" and "year", which have to agree.
void ParseTime(const Target& target, Selection& selection) {
  if (const std::string_view month = ValueOf(target, "month"); !month.empty()) {
    ParseMonth(month, selection);
  }
  if (const std::string_view text = ValueOf(target, "year"); !text.empty()) {
    const auto year = ParseDigits(text, YEAR_DIGITS, 1, LAST_YEAR);
    if (!year) {
      throw BadQuery("A year is written as 2026.");
    }
    if (selection.year.value_or(*year) != *year) {
      throw BadQuery("The month is not in the year.");
    }
    selection.year = year;
  }
}

/// The words of a search. A search that ignored some of them would find too much.
std::string ParseWords(const Target& target) {
  std::string words(ValueOf(target, "words"));
  if (words.size() > LONGEST_SEARCH || SearchWords(words).size() > MOST_SEARCH_WORDS) {
    throw BadQuery("A search may have at most " + std::to_string(MOST_SEARCH_WORDS) +
                   " different words and " + std::to_string(LONGEST_SEARCH) + " bytes.");
  }
  return words;
}

/// The first second of a month in local time. The 13th month is the first one of the next year.
std::int64_t BeginOfMonth(int year, int month) {
  std::tm time{};
  time.tm_year = year - 1900;
  time.tm_mon = month - 1;
  time.tm_mday = 1;
  time.tm_isdst = -1;
  return std::mktime(&time);
}

} // namespace

Selection ParseSelection(const Target& target) {
  Selection selection;
  selection.words = ParseWords(target);
  if (const std::string_view volume = ValueOf(target, "volume"); !volume.empty()) {
    selection.volume = volume;
  }
  selection.folder = ParseId(target, "folder");
  ParseTime(target, selection);
  return selection;
}

Filter ToFilter(const Selection& selection) {
  Filter filter{.folder = selection.folder,
                .volume = selection.volume,
                .words = selection.words,
                .times = std::nullopt};
  if (selection.year) {
    const int first = selection.month.value_or(1);
    const int last = selection.month.value_or(MONTHS_PER_YEAR);
    filter.times = std::pair(BeginOfMonth(*selection.year, first),
                             BeginOfMonth(*selection.year, last + 1) - 1);
  }
  return filter;
}

std::optional<std::int64_t> ParseId(const Target& target, const std::string& name) {
  const std::string* const text = target.Find(name);
  if (text == nullptr || text->empty()) {
    return std::nullopt;
  }
  const auto number = ParseNumber(*text);
  if (!number) {
    throw BadQuery("The parameter " + name + " is a number.");
  }
  return number;
}

std::size_t ParseCount(const Target& target) {
  constexpr std::int64_t STANDARD = 100;
  constexpr std::int64_t MOST = 200;
  const std::int64_t count = ParseId(target, "count").value_or(STANDARD);
  if (count < 1 || count > MOST) {
    throw BadQuery("The parameter count is a number from 1 to 200.");
  }
  return static_cast<std::size_t>(count);
}

} // namespace orva::web
