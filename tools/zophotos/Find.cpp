#include "Commands.h"
#include "Json.h"
#include "MergedDatabase.h"

#include <fnmatch.h>

#include <optional>

namespace orva::zophotos {

namespace {

/// Matches a pattern against the last component of a path, or against the whole path if the pattern
/// has a separator. A pattern without wildcards matches anywhere in the text.
class Matcher {
public:
  Matcher(const std::string& pattern, bool ignoreCase)
      : pattern_(pattern.find_first_of("*?[\\") == std::string::npos ? "*" + pattern + "*"
                                                                     : pattern),
        wholePath_(pattern.find('/') != std::string::npos), flags_(ignoreCase ? FNM_CASEFOLD : 0) {
    UseUtf8(); // for fnmatch
  }

  /// `path` is the path of a file, or of a folder without the separator at its end.
  bool Matches(const std::string& path) const {
    const std::size_t name = wholePath_ ? 0 : path.rfind('/') + 1;
    return fnmatch(pattern_.c_str(), path.c_str() + name, flags_) == 0;
  }

private:
  std::string pattern_;
  bool wholePath_;
  int flags_;
};

void Print(const std::string& path, const Item& item, bool isFolder, const Search& search,
           Form form) {
  if (search.nullTerminated) {
    std::cout << path << '\0';
  } else if (form == Form::Json) {
    PrintLine({{"type", isFolder ? "folder" : "file"},
               {"path", ToUtf8(path)},
               {"volume", ToUtf8(item.volume)},
               {"modified", JsonTime(isFolder ? item.folderModified : item.modified)}});
  } else {
    std::cout << Printable(path) << '\n';
  }
}

} // namespace

ExitStatus FindItems(const std::string& path, const Search& search, Form form) {
  SQLite::Database database = CopyDatabase(path);
  const Matcher matcher(search.pattern, search.ignoreCase);
  bool found = false;
  std::optional<std::int64_t> folderId;
  Walk(database, [&](const Item& item) {
    if (folderId != item.folderId) {
      folderId = item.folderId;
      if (matcher.Matches(item.folder.substr(0, item.folder.size() - 1))) {
        found = true;
        Print(item.folder, item, true, search, form);
      }
    }
    if (item.file && matcher.Matches(item.folder + *item.file)) {
      found = true;
      Print(item.folder + *item.file, item, false, search, form);
    }
  });
  return found ? ExitStatus::Success : ExitStatus::Negative;
}

} // namespace orva::zophotos
