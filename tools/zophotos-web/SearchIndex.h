#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <random>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

// The full-text index (FTS5) has one document for each photo. Its text is made here: the words of
// the path below the volume, and marks that stand for the volume, the folder and frequent
// beginnings of words. The tokenizer only splits this text at its spaces.

namespace orva::web {

/// The declaration of the index in SQL: the names of the columns and the options.
inline constexpr const char* SEARCH_INDEX =
    "fts5(words, content='', detail=none, columnsize=0, tokenize=\"ascii tokenchars '!#@'\")";

/// Appends the words of `text` to `words`, each with a space after it: lower case, without accents.
/// A word is a run of letters or a run of digits: IMG_20260102 has two. Bytes that are not UTF-8
/// separate words. The end of a long word is cut off.
void AppendWords(std::string_view text, std::string& words);

/// The beginnings of words that many photos have. FTS5 collects all photos of a prefix before
/// it returns the first, so these prefixes are indexed like words.
class FrequentPrefixes {
public:
  FrequentPrefixes() = default;
  explicit FrequentPrefixes(const std::vector<std::string>& prefixes);

  /// Appends the marks of the prefixes that the words of `words` have. A mark may appear twice.
  void AppendMarks(std::string_view words, std::string& marks) const;

  /// The shortest frequent prefix of `word` that has at least `length` bytes.
  std::optional<std::string> Find(std::string_view word, std::size_t length) const;

private:
  struct Node {
    std::array<std::uint16_t, 256> next{}; ///< number of a node for each byte; 0 for none
    bool isFrequent = false;
  };
  static constexpr std::size_t MOST_NODES = 4096;

  void Add(const std::string& prefix);

  std::vector<Node> nodes_;
};

/// Finds the frequent prefixes by a sample of all photos.
class PrefixSample {
public:
  /// A sample of about `photos` photos.
  explicit PrefixSample(std::int64_t photos);

  /// Whether the next photo belongs to the sample. At random: cameras and folders have periods.
  bool Next() { return random_() % interval_ == 0; }

  /// Adds the words of a photo in the sample. Marks of volumes and folders do not count.
  void Add(std::string_view words);

  std::vector<std::string> Frequent() const;

private:
  struct Hash {
    using is_transparent = void;
    std::size_t operator()(std::string_view text) const {
      return std::hash<std::string_view>()(text);
    }
  };

  std::uint_fast32_t interval_;
  std::minstd_rand random_; ///< always the same numbers
  std::unordered_map<std::string, std::int64_t, Hash, std::equal_to<>> counts_;
};

/// The mark of all photos of a volume or in a folder. A volume has a number in the snapshot.
std::string VolumeMark(std::int64_t volume);
std::string FolderMark(std::int64_t folder);

/// What a search may have: bytes, and words that SearchWords finds.
inline constexpr std::size_t LONGEST_SEARCH = 4'096;
inline constexpr std::size_t MOST_SEARCH_WORDS = 32;

/// The different words of a search, sorted. A word that another one begins with is left out: it
/// matches as well.
std::vector<std::string> SearchWords(std::string_view text);

/// The words of a volume's mount point, which the index does not have.
struct VolumeWords {
  std::int64_t volume = 0; ///< its number
  std::string words;       ///< as AppendWords writes them
};

/// What a search asks for.
struct SearchTerms {
  std::string_view words; ///< any text
  std::optional<std::int64_t> volume;
  std::optional<std::int64_t> folder;
};

/// Returns the smallest word of the index that is not smaller than `from`.
using NextWord = std::function<std::optional<std::string>(const std::string& from)>;

/// The expression for MATCH that finds the photos for which all terms hold; nothing if there can be
/// none. Empty if the terms do not restrict anything. A text that has no words and is not blank
/// matches nothing. `volumes` are all volumes of the index.
std::optional<std::string> MatchExpression(const SearchTerms& terms,
                                           const std::vector<VolumeWords>& volumes,
                                           const FrequentPrefixes& frequent,
                                           const NextWord& nextWord);

} // namespace orva::web
