// The operations on paths. The input is three texts, one a line; paths are resolved in a small tree
// of files in /tmp.

#include "Fuzzing.h"

#include "FolderItemCmp.h"

#include "orvadb/Folder.h"
#include "orvautil/Decodestring.h"
#include "orvautil/Path.h"

#include <algorithm>
#include <array>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>

namespace {

using namespace orva;
using fuzz::Require;
using util::MakePath;
using util::Path;

using Texts = std::array<std::string, 3>;

std::string PercentEncode(const std::string& text) {
  constexpr char digits[] = "0123456789abcdef";
  std::string encoded;
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte == 0) {
      encoded += c; // cannot be escaped
    } else {
      encoded += {'%', digits[byte / 16], digits[byte % 16]};
    }
  }
  return encoded;
}

void Decode(const std::string& text) {
  const std::string decoded = util::Decodestring(text);
  Require(decoded.size() <= text.size() && (text.size() - decoded.size()) % 2 == 0,
          "decoding replaces three characters with one");
  Require(std::ranges::count(decoded, '\0') == std::ranges::count(text, '\0'),
          "decoding makes no NUL");
  Require(text.find('%') != std::string::npos || decoded == text,
          "what has no escape stays as it is");
  Require(util::Decodestring(PercentEncode(text)) == text, "what was encoded is decoded");
}

void Join(const std::string& directory, const std::string& name) {
  const std::string path = MakePath(directory, name);
  if (directory.empty()) {
    Require(path == name, "no directory gives the name");
    return;
  }
  const std::size_t stripped = directory.find_last_not_of('/') + 1;
  const std::string tail = path.substr(stripped);
  Require(path.starts_with(directory.substr(0, stripped)) && tail.starts_with('/'),
          "a path begins with its directory and a separator");
  Require(!tail.starts_with("//"), "a directory and a name have one separator between them");
  Require(name.ends_with(tail.substr(1)), "a path ends with its name");
  Require(MakePath(directory + "/", name) == path && MakePath(directory, "/" + name) == path,
          "surplus separators do not matter");
}

void Strip(const std::string& path) {
  const std::string basic = Path(path).Basic();
  Require(path.starts_with(basic) && path.find_first_not_of('/', basic.size()) == std::string::npos,
          "only trailing separators are removed");
  Require(basic.empty() == path.empty() && (basic == "/" || !basic.ends_with('/')),
          "no trailing separator is left, except for the root");
  Require(Path(basic).Basic() == basic, "removing separators twice changes nothing");
}

void Resolve(const std::string& path) {
  const std::string canonical = Path(path).Canonicalize();
  Require(canonical.empty() == !Path(path).Exists(), "what exists has a canonical path");
  if (canonical.empty()) {
    return;
  }
  const std::string entry = canonical + "/";
  Require(canonical.starts_with('/') && (canonical == "/" || !canonical.ends_with('/')),
          "a canonical path is absolute and has no trailing separator");
  Require(canonical == "/" ||
              (entry.find("//") == std::string::npos && entry.find("/./") == std::string::npos &&
               entry.find("/../") == std::string::npos),
          "a canonical path has no dots and no doubled separators");
  Require(Path(canonical).Canonicalize() == canonical, "a canonical path is its own");
  Require(std::filesystem::equivalent(path.c_str(), canonical),
          "a canonical path leads to the same place");
}

void Order(const Texts& texts) {
  std::array<db::Folder, 3> folders;
  for (std::size_t i = 0; i < texts.size(); ++i) {
    folders[i].path = texts[i];
  }
  const auto isLess = [&](std::size_t a, std::size_t b) {
    return dbmerger::FolderItemCmp<db::FolderItem>()(&folders[a], &folders[b]);
  };
  std::array<std::size_t, 3> order{0, 1, 2};
  do {
    const auto [a, b, c] = order;
    Require(!isLess(a, a), "no path comes before itself");
    Require(!isLess(a, b) || !isLess(b, a), "of two paths one comes first");
    Require(isLess(a, b) || isLess(b, a) || texts[a] == texts[b], "different paths have an order");
    Require(!isLess(a, b) || !isLess(b, c) || isLess(a, c), "the order is transitive");
    Require(texts[a] == texts[b] || !texts[b].starts_with(texts[a]) || isLess(a, b),
            "a folder comes before what it holds");
  } while (std::ranges::next_permutation(order).found);
}

Texts SplitLines(const std::string& input) {
  Texts texts;
  std::istringstream lines(input);
  std::getline(lines, texts[0]);
  std::getline(lines, texts[1]);
  texts[2].assign(std::istreambuf_iterator<char>(lines), {});
  return texts;
}

} // namespace

int LLVMFuzzerInitialize(int* /*count*/, char*** /*arguments*/) {
  namespace fs = std::filesystem;
  fs::create_directories("/tmp/tree/a/b");
  std::ofstream("/tmp/tree/f");
  fs::create_directory_symlink("a/b", "/tmp/tree/l");
  fs::create_symlink("loop", "/tmp/tree/loop");
  fs::create_symlink("nowhere", "/tmp/tree/d");
  fs::current_path("/tmp/tree");
  return 0;
}

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const Texts texts = SplitLines(std::string(data, data + size));
  for (const std::string& text : texts) {
    Decode(text);
    Strip(text);
    Resolve(text);
    for (const std::string& other : texts) {
      Join(text, other);
    }
  }
  Order(texts);
  return 0;
}
