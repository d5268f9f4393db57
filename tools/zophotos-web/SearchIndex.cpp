#include "SearchIndex.h"

#include <boost/locale/utf.hpp>
#include <unicode/uchar.h>
#include <unicode/unorm2.h>
#include <unicode/ustring.h>

#include <algorithm>
#include <iterator>
#include <stdexcept>

namespace orva::web {

namespace {

/// Bytes of a word that count.
constexpr std::size_t LONGEST_WORD = 64;

/// A prefix is frequent if more photos than this have it. To collect so many photos takes some
/// milliseconds.
constexpr std::int64_t FREQUENT_FROM = 8'000;
constexpr std::size_t LONGEST_PREFIX = 16;

constexpr std::int64_t SAMPLED_PHOTOS = 20'000;
constexpr std::size_t MOST_SAMPLED_WORDS = 200'000;

/// If at most so many words of the index begin with a word, the search names them.
constexpr std::size_t MOST_ALTERNATIVES = 8;

// Begin the marks. They are no letters or digits, so no word begins with them.
constexpr char PREFIX_MARK = '!';
constexpr char VOLUME_MARK = '#';
constexpr char FOLDER_MARK = '@';

enum class Kind { Separator, Letter, Digit, Ideograph };

/// Appends characters to words; a word ends where the kind of the characters changes.
class WordWriter {
public:
  explicit WordWriter(std::string& words) : words_(words), begin_(words.size()) {}
  ~WordWriter() { EndWord(); }
  WordWriter(const WordWriter&) = delete;
  WordWriter& operator=(const WordWriter&) = delete;

  void Begin(Kind kind) {
    if (kind != kind_ || kind == Kind::Ideograph) {
      EndWord();
      kind_ = kind;
    }
  }

  /// Appends a character of the kind that Begin was called with.
  template <typename Append>
  void Add(std::size_t size, const Append& append) {
    if (words_.size() - begin_ + size <= LONGEST_WORD) {
      append(words_);
    }
  }

private:
  void EndWord() {
    if (words_.size() != begin_) {
      words_ += ' ';
    }
    begin_ = words_.size();
  }

  std::string& words_;
  std::size_t begin_;
  Kind kind_ = Kind::Separator;
};

void AppendAsciiWords(std::string_view text, std::string& words) {
  WordWriter writer(words);
  for (const char c : text) {
    const bool isUpper = c >= 'A' && c <= 'Z';
    const Kind kind = isUpper || (c >= 'a' && c <= 'z') ? Kind::Letter
                      : c >= '0' && c <= '9'            ? Kind::Digit
                                                        : Kind::Separator;
    writer.Begin(kind);
    if (kind != Kind::Separator) {
      writer.Add(1, [&](std::string& out) { out += isUpper ? static_cast<char>(c + 32) : c; });
    }
  }
}

using Characters = std::basic_string<UChar>;

void Require(UErrorCode code) {
  if (U_FAILURE(code)) {
    throw std::runtime_error(std::string("cannot normalize a text: ") + u_errorName(code));
  }
}

Characters FromUtf8(std::string_view text) {
  Characters characters(text.size(), u' ');
  std::int32_t size = 0;
  UErrorCode code = U_ZERO_ERROR;
  u_strFromUTF8WithSub(characters.data(), static_cast<std::int32_t>(characters.size()), &size,
                       text.data(), static_cast<std::int32_t>(text.size()), ' ', nullptr, &code);
  Require(code);
  characters.resize(static_cast<std::size_t>(size));
  return characters;
}

Characters Normalize(const UNormalizer2* form, const Characters& characters) {
  // The longest expansion of a character has 18 units.
  Characters result(characters.size() * 18 + 1, u' ');
  UErrorCode code = U_ZERO_ERROR;
  const std::int32_t size =
      unorm2_normalize(form, characters.data(), static_cast<std::int32_t>(characters.size()),
                       result.data(), static_cast<std::int32_t>(result.size()), &code);
  Require(code);
  result.resize(static_cast<std::size_t>(size));
  return result;
}

Kind KindOf(UChar32 point) {
  if (u_hasBinaryProperty(point, UCHAR_IDEOGRAPHIC) != 0) {
    return Kind::Ideograph; // there are no spaces between words
  }
  return u_isdigit(point) != 0                                                    ? Kind::Digit
         : u_isalpha(point) != 0 || u_charType(point) == U_COMBINING_SPACING_MARK ? Kind::Letter
                                                                                  : Kind::Separator;
}

void AppendUnicodeWords(std::string_view text, std::string& words) {
  UErrorCode code = U_ZERO_ERROR;
  const UNormalizer2* const fold = unorm2_getNFKCCasefoldInstance(&code);
  const UNormalizer2* const decompose = unorm2_getNFDInstance(&code);
  Require(code);
  const Characters characters = Normalize(decompose, Normalize(fold, FromUtf8(text)));
  WordWriter writer(words);
  for (std::size_t i = 0; i < characters.size(); ++i) {
    UChar32 point = characters[i];
    if (point >= 0xD800 && point < 0xDC00 && i + 1 < characters.size()) {
      point = 0x10000 + ((point - 0xD800) << 10) + (characters[++i] - 0xDC00);
    }
    if (u_charType(point) == U_NON_SPACING_MARK) {
      continue; // an accent
    }
    const Kind kind = KindOf(point);
    writer.Begin(kind);
    if (kind != Kind::Separator) {
      using Utf8 = boost::locale::utf::utf_traits<char>;
      const auto value = static_cast<boost::locale::utf::code_point>(point);
      writer.Add(static_cast<std::size_t>(Utf8::width(value)),
                 [&](std::string& out) { Utf8::encode(value, std::back_inserter(out)); });
    }
  }
}

/// Calls `visit` for each word of a text that AppendWords wrote.
template <typename Visit>
void ForEachWord(std::string_view words, const Visit& visit) {
  while (!words.empty()) {
    const std::size_t size = std::min(words.find(' '), words.size());
    visit(words.substr(0, size));
    words.remove_prefix(std::min(size + 1, words.size()));
  }
}

/// Whether a character of a UTF-8 text begins at this place, or the text ends.
bool IsBoundary(std::string_view text, std::size_t place) {
  return place == text.size() || (static_cast<unsigned char>(text[place]) & 0xC0) != 0x80;
}

std::size_t CommonPrefix(std::string_view a, std::string_view b) {
  const auto [end, other] = std::mismatch(a.begin(), a.end(), b.begin(), b.end());
  return static_cast<std::size_t>(end - a.begin());
}

bool IsBlank(std::string_view text) {
  return text.find_first_not_of(" \t\r\n") == std::string_view::npos;
}

/// In quotation marks nothing is an operator. No word has one.
std::string Quoted(const std::string& token) {
  return '"' + token + '"';
}

/// The expression for the photos that have a word with this beginning; nothing if there are none.
std::optional<std::string> PrefixExpression(const std::string& word,
                                            const FrequentPrefixes& frequent,
                                            const NextWord& nextWord) {
  if (frequent.Find(word, word.size())) {
    return Quoted(PREFIX_MARK + word);
  }
  std::string expression;
  std::string from = word;
  for (std::size_t alternatives = 0; alternatives <= MOST_ALTERNATIVES; ++alternatives) {
    const auto next = nextWord(from);
    if (!next || !next->starts_with(word)) {
      return expression.empty() ? std::nullopt : std::optional(expression);
    }
    const auto prefix = frequent.Find(*next, word.size());
    expression +=
        (expression.empty() ? "" : " OR ") + Quoted(prefix ? PREFIX_MARK + *prefix : *next);
    // Continues after the words with this prefix, or after this word. No word has such a byte.
    from = prefix ? *prefix + '\xFF' : *next + '\x01';
  }
  return Quoted(word) + " *";
}

/// Whether one of the words begins with `word`.
bool HasPrefix(std::string_view words, std::string_view word) {
  bool has = false;
  ForEachWord(words, [&](std::string_view other) { has = has || other.starts_with(word); });
  return has;
}

/// The expression for the photos that have a word with this beginning below their volume or in its
/// mount point. Empty if these are all photos; nothing if there are none.
std::optional<std::string> WordExpression(const std::string& word, const SearchTerms& terms,
                                          const std::vector<VolumeWords>& volumes,
                                          const FrequentPrefixes& frequent,
                                          const NextWord& nextWord) {
  std::string marks;
  std::size_t candidates = 0;
  std::size_t matches = 0;
  for (const VolumeWords& volume : volumes) {
    if (!terms.volume || *terms.volume == volume.volume) {
      ++candidates;
      if (HasPrefix(volume.words, word)) {
        ++matches;
        marks += (marks.empty() ? "" : " OR ") + Quoted(VolumeMark(volume.volume));
      }
    }
  }
  if (matches != 0 && matches == candidates) {
    return std::string();
  }
  const auto below = PrefixExpression(word, frequent, nextWord);
  if (!below) {
    return matches == 0 ? std::nullopt : std::optional(marks);
  }
  return matches == 0 ? *below : *below + " OR " + marks;
}

} // namespace

void AppendWords(std::string_view text, std::string& words) {
  if (std::ranges::all_of(text, [](char c) { return static_cast<unsigned char>(c) < 0x80; })) {
    AppendAsciiWords(text, words);
  } else {
    AppendUnicodeWords(text, words);
  }
}

FrequentPrefixes::FrequentPrefixes(const std::vector<std::string>& prefixes) {
  for (const std::string& prefix : prefixes) {
    Add(prefix);
  }
}

void FrequentPrefixes::Add(const std::string& prefix) {
  if (nodes_.empty()) {
    nodes_.emplace_back();
  }
  if (nodes_.size() + prefix.size() > MOST_NODES) {
    return;
  }
  std::size_t node = 0;
  for (const char c : prefix) {
    const auto byte = static_cast<unsigned char>(c);
    if (nodes_[node].next.at(byte) == 0) {
      nodes_[node].next.at(byte) = static_cast<std::uint16_t>(nodes_.size());
      nodes_.emplace_back();
    }
    node = nodes_[node].next.at(byte);
  }
  nodes_[node].isFrequent = true;
}

void FrequentPrefixes::AppendMarks(std::string_view words, std::string& marks) const {
  if (nodes_.empty()) {
    return;
  }
  ForEachWord(words, [&](std::string_view word) {
    std::size_t node = 0;
    for (std::size_t length = 0; length < word.size(); ++length) {
      node = nodes_[node].next.at(static_cast<unsigned char>(word[length]));
      if (node == 0) {
        break;
      }
      if (nodes_[node].isFrequent) {
        marks += PREFIX_MARK;
        marks += word.substr(0, length + 1);
        marks += ' ';
      }
    }
  });
}

std::optional<std::string> FrequentPrefixes::Find(std::string_view word, std::size_t length) const {
  std::size_t node = 0;
  for (std::size_t i = 0; i < word.size() && !nodes_.empty(); ++i) {
    node = nodes_[node].next.at(static_cast<unsigned char>(word[i]));
    if (node == 0) {
      break;
    }
    if (i + 1 >= length && nodes_[node].isFrequent) {
      return std::string(word.substr(0, i + 1));
    }
  }
  return std::nullopt;
}

PrefixSample::PrefixSample(std::int64_t photos)
    : interval_(static_cast<std::uint_fast32_t>(
          std::clamp<std::int64_t>(photos / SAMPLED_PHOTOS, 1, std::minstd_rand::max()))) {}

void PrefixSample::Add(std::string_view words) {
  ForEachWord(words, [this](std::string_view word) {
    if (word.starts_with(VOLUME_MARK) || word.starts_with(FOLDER_MARK)) {
      return;
    }
    const auto found = counts_.find(word);
    if (found != counts_.end()) {
      ++found->second;
    } else if (counts_.size() < MOST_SAMPLED_WORDS) {
      counts_.emplace(word, 1);
    }
  });
}

std::vector<std::string> PrefixSample::Frequent() const {
  std::vector<std::pair<std::string_view, std::int64_t>> words(counts_.begin(), counts_.end());
  std::ranges::sort(words);
  std::vector<std::string> prefixes;
  for (std::size_t length = 1; length <= LONGEST_PREFIX; ++length) {
    for (auto begin = words.begin(); begin != words.end();) {
      const std::string_view prefix = begin->first.substr(0, length);
      const auto end = std::find_if(begin, words.end(), [&](const auto& word) {
        return word.first.substr(0, length) != prefix;
      });
      std::int64_t count = 0;
      for (auto word = begin; word != end; ++word) {
        count += word->second;
      }
      // A single word, or words with a longer common prefix, are searched for under their own name.
      if (count * static_cast<std::int64_t>(interval_) > FREQUENT_FROM && std::next(begin) != end &&
          IsBoundary(begin->first, length) &&
          CommonPrefix(begin->first, std::prev(end)->first) == length) {
        prefixes.emplace_back(prefix);
      }
      begin = end;
    }
  }
  return prefixes;
}

std::vector<std::string> SearchWords(std::string_view text) {
  std::string words;
  AppendWords(text, words);
  std::vector<std::string> all;
  ForEachWord(words, [&](std::string_view word) { all.emplace_back(word); });
  std::ranges::sort(all);
  std::vector<std::string> result;
  for (std::size_t i = 0; i < all.size(); ++i) {
    if (i + 1 == all.size() || !all[i + 1].starts_with(all[i])) {
      result.push_back(all[i]);
    }
  }
  return result;
}

std::string VolumeMark(std::int64_t volume) {
  return VOLUME_MARK + std::to_string(volume);
}

std::string FolderMark(std::int64_t folder) {
  return FOLDER_MARK + std::to_string(folder);
}

std::optional<std::string> MatchExpression(const SearchTerms& terms,
                                           const std::vector<VolumeWords>& volumes,
                                           const FrequentPrefixes& frequent,
                                           const NextWord& nextWord) {
  std::string expression;
  const auto add = [&expression](const std::string& part) {
    expression += (expression.empty() ? "" : " AND ") + part;
  };
  if (terms.volume) {
    add(Quoted(VolumeMark(*terms.volume)));
  }
  if (terms.folder) {
    add(Quoted(FolderMark(*terms.folder)));
  }
  const std::vector<std::string> words = SearchWords(terms.words);
  if (words.empty() && !IsBlank(terms.words)) {
    return std::nullopt;
  }
  for (const std::string& word : words) {
    const auto part = WordExpression(word, terms, volumes, frequent, nextWord);
    if (!part) {
      return std::nullopt;
    }
    if (!part->empty()) {
      add('(' + *part + ')');
    }
  }
  return expression;
}

} // namespace orva::web
