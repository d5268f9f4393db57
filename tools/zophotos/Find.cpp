#include "Commands.h"
#include "Json.h"
#include "MergedDatabase.h"

#include <fnmatch.h>

#include <algorithm>
#include <optional>
#include <set>
#include <string_view>
#include <utility>

namespace orva::zophotos {

namespace {

constexpr std::string_view SHARES = "/shares/";

/// `path` with single separators.
std::string WithoutRepeatedSeparators(std::string path) {
  const auto rest =
      std::unique(path.begin(), path.end(), [](char a, char b) { return a == '/' && b == '/'; });
  path.erase(rest, path.end());
  return path;
}

/// Matches a pattern against the last component of a path. A pattern with a separator is compared
/// with the whole path, and with the path relative to the shares root. A pattern without wildcards
/// matches anywhere in the text. A name or path matches itself, also as Printable writes it.
class Matcher {
public:
  Matcher(const std::string& pattern, bool ignoreCase)
      : wholePath_(pattern.find('/') != std::string::npos), flags_(ignoreCase ? FNM_CASEFOLD : 0) {
    UseUtf8(); // for fnmatch
    const bool isText = pattern.find_first_of("*?[\\") == std::string::npos;
    for (const std::string& spelling : {pattern, WithoutRepeatedSeparators(pattern)}) {
      patterns_.insert(isText ? "*" + spelling + "*" : spelling);
      for (std::string name : {spelling, Unescape(spelling)}) {
        if (name.ends_with('/')) {
          name.pop_back(); // of a folder as it is printed
        }
        names_.insert(std::move(name));
      }
    }
  }

  /// `path` is the path of a file, or of a folder without the separator at its end.
  bool Matches(const std::string& path) const {
    if (!wholePath_) {
      return MatchesText(path.substr(path.rfind('/') + 1));
    }
    return MatchesText(path) ||
           (path.starts_with(SHARES) && MatchesText(path.substr(SHARES.size())));
  }

private:
  bool MatchesText(const std::string& text) const {
    return names_.contains(text) || std::ranges::any_of(patterns_, [&](const std::string& pattern) {
             return fnmatch(pattern.c_str(), text.c_str(), flags_) == 0;
           });
  }

  std::set<std::string> patterns_;
  std::set<std::string> names_;
  bool wholePath_;
  int flags_;
};

void Print(const std::string& path, const Item& item, bool isFolder, const Search& search,
           Form form) {
  if (search.nullTerminated) {
    std::cout << path << '\0';
  } else if (form == Form::JsonText) {
    PrintLine({{"type", isFolder ? "folder" : "file"},
               {"path", ToUtf8(path)},
               {"volume", ToUtf8(item.volume)},
               {"modified", JsonTime(isFolder ? item.folderModified : item.modified)}});
  } else {
    std::cout << FolderColor(search.escapes ? Printable(path) : path, search.colors && isFolder)
              << '\n';
  }
}

} // namespace

ExitStatus FindItems(const std::string& path, const Search& search, Form form) {
  SQLite::Database database = CopyDatabase(path);
  const Matcher matcher(search.pattern, search.ignoreCase);
  const Matcher ignoringCase(search.pattern, true);
  bool found = false;
  bool foundIgnoringCase = search.ignoreCase || !search.hints;
  const auto matches = [&](const std::string& item) {
    const bool match = matcher.Matches(item);
    found = found || match;
    foundIgnoringCase = foundIgnoringCase || found || ignoringCase.Matches(item);
    return match;
  };
  std::optional<std::int64_t> folderId;
  Walk(database, [&](const Item& item) {
    if (folderId != item.folderId) {
      folderId = item.folderId;
      if (search.folders && matches(item.folder.substr(0, item.folder.size() - 1))) {
        Print(item.folder, item, true, search, form);
      }
    }
    if (search.files && item.file && matches(item.folder + *item.file)) {
      Print(item.folder + *item.file, item, false, search, form);
    }
  });
  if (search.hints && !search.ignoreCase && !found && foundIgnoringCase) {
    std::cerr << "zophotos: nothing matches; with -i, which ignores case, something does\n";
  }
  return found ? ExitStatus::Success : ExitStatus::Negative;
}

} // namespace orva::zophotos
