#include "Commands.h"
#include "Json.h"
#include "MergedDatabase.h"
#include "Paths.h"

#include <SQLiteCpp/Statement.h>

#include <algorithm>
#include <string_view>
#include <utility>
#include <vector>

namespace orva::zophotos {

namespace {

struct StoredFolder {
  std::string path;
  std::int64_t files;
};

/// A line of the tree. Its path points into the list of folders. A folder without a row, known only
/// from paths below it, has a line, too.
struct Node {
  std::string_view path; ///< a folder's path, or the beginning of one
  std::size_t depth;
  std::int64_t files = 0;
  std::int64_t filesBelow = 0; ///< at any depth, with its own
  bool isStored = false;
  bool isLast = false; ///< the last one of its siblings
};

/// Orders paths so that everything in a folder follows it directly: the separator sorts before all
/// other characters.
bool ComesBefore(const std::string& a, const std::string& b) {
  const auto rank = [](char byte) { return byte == '/' ? -1 : static_cast<unsigned char>(byte); };
  return std::ranges::lexicographical_compare(a, b, {}, rank, rank);
}

std::vector<StoredFolder> ReadFolders(SQLite::Database& database, const std::string& top) {
  SQLite::Statement query(database,
                          "SELECT name, (SELECT count(*) FROM Files f WHERE f.folder_id = "
                          "o.folder_id) FROM Folders o WHERE name >= ? AND name < ?");
  query.bind(1, top);
  query.bind(2, EndOfFolder(top));
  std::vector<StoredFolder> folders;
  while (query.executeStep()) {
    folders.push_back(
        {.path = query.getColumn(0).getString(), .files = query.getColumn(1).getInt64()});
  }
  std::ranges::sort(folders, ComesBefore, &StoredFolder::path);
  return folders;
}

/// Adds nodes for the components of `path` that are not open yet, and returns the last one. `open`
/// holds the paths from the top to the current node.
Node& AddPath(std::vector<Node>& nodes, std::vector<std::string_view>& open, std::string_view path,
              std::size_t topLength) {
  while (!open.empty() && !path.starts_with(open.back())) {
    open.pop_back();
  }
  while (open.empty() || open.back() != path) {
    const std::size_t begin = open.empty() ? topLength - 1 : open.back().size();
    const std::size_t end = path.find('/', begin);
    open.push_back(path.substr(0, end == std::string_view::npos ? end : end + 1));
    nodes.push_back({.path = open.back(), .depth = open.size() - 1});
  }
  return nodes.back();
}

std::vector<Node> MakeTree(const std::vector<StoredFolder>& folders, const std::string& top) {
  std::vector<Node> nodes;
  std::vector<std::string_view> open;
  for (const StoredFolder& folder : folders) {
    Node& node = AddPath(nodes, open, folder.path, top.size());
    node.isStored = true;
    node.files += folder.files;
  }
  // Read from the end, the first node of a depth below a parent is the parent's last child.
  std::vector<bool> hasLast;
  std::vector<std::int64_t> below; // the files of the nodes read whose parents are still to come
  std::for_each(nodes.rbegin(), nodes.rend(), [&](Node& node) {
    const bool known = node.depth < hasLast.size() && hasLast[node.depth];
    node.isLast = !known;
    hasLast.resize(node.depth + 1, false);
    hasLast[node.depth] = true;
    below.resize(std::max(below.size(), node.depth + 2), 0);
    node.filesBelow = node.files + std::exchange(below[node.depth + 1], 0);
    below[node.depth] += node.filesBelow;
  });
  return nodes;
}

void PrintTreeText(const std::vector<Node>& nodes, bool colors) {
  std::vector<std::string> indents; // one for each level above the node
  for (const Node& node : nodes) {
    indents.resize(node.depth);
    if (node.depth == 0) {
      std::cout << FolderColor(Printable(node.path), colors);
      indents.emplace_back();
    } else {
      const std::size_t parentLength = node.path.rfind('/', node.path.size() - 2) + 1;
      for (const std::string& indent : indents) {
        std::cout << indent;
      }
      std::cout << (node.isLast ? "└── " : "├── ")
                << FolderColor(Printable(node.path.substr(parentLength)), colors);
      indents.emplace_back(node.isLast ? "    " : "│   ");
    }
    std::cout << "  " << Count(node.filesBelow, "file") << (node.isStored ? "" : " (not stored)")
              << '\n';
  }
}

void PrintTreeJson(const std::vector<Node>& nodes) {
  for (const Node& node : nodes) {
    PrintLine({{"path", ToUtf8(node.path)},
               {"depth", node.depth},
               {"files", node.files},
               {"stored", node.isStored},
               {"files_below", node.filesBelow}});
  }
}

} // namespace

ExitStatus ShowTree(const std::string& path, const std::string& folder, std::size_t levels,
                    bool colors, Form form) {
  // Counting reads every file of a large library, which takes long.
  SQLite::Database database = CopyDatabase(path);
  const std::vector<std::string> spellings = Spellings(folder);
  const auto top = FindFolder(database, spellings);
  if (!top) {
    const auto file = std::ranges::find_if(
        spellings, [&](const std::string& spelling) { return IsFile(database, spelling); });
    if (file != spellings.end()) {
      throw Failure(ExitStatus::Negative, *file + " is a file, not a folder");
    }
    ThrowMissing(database, spellings, "there is no folder " + FolderPath(spellings.front()));
  }
  const std::vector<StoredFolder> folders = ReadFolders(database, *top);
  std::vector<Node> nodes = MakeTree(folders, *top);
  std::erase_if(nodes, [levels](const Node& node) { return node.depth > levels; });
  if (form == Form::JsonText) {
    PrintTreeJson(nodes);
  } else {
    PrintTreeText(nodes, colors);
  }
  return ExitStatus::Success;
}

} // namespace orva::zophotos
