#include "UserFiles.h"

#include "transcoder/Photos.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <system_error>

namespace orva::test {

namespace fs = std::filesystem;

namespace {

/// The disk keeps at most so many files.
constexpr std::size_t MOST_FILES = 300;
constexpr std::size_t MOST_FOLDERS = 60;

const std::vector<std::string> NAMES = {
    "a.jpg",       "b.JPG",     "c.png",        "d.webp",        "e.tif",
    "f.gif",       "g.jpeg",    "h i.jpg",      "-rf.jpg",       "--help.png",
    "a'b\"c.jpg",  "l\nm.jpg",  "\xFF\xFE.jpg", "$(reboot).jpg", "n[page=2].jpg",
    ".hidden.jpg", "old.jpg~",  "p.jpg.bak",    "%s.jpg",        "q\\r.jpg",
    "s;t&u|v.jpg", "*.jpg",     "notes.txt",    "film.mp4",      "\xC3\xA9t\xC3\xA9.jpg",
    "._apple.jpg", "Thumbs.db", "x y.jpg ",     " .jpg",         "archive"};
const std::vector<std::string> FOLDERS = {"2024",  "2025", "With Space", "-x",     "\xE9\xE8",
                                          "l\nm",  "'",    ".hidden",    "old~",   "lost+found",
                                          "a.jpg", "deep", "Import",     "Camera", "\""};

} // namespace

void UserFiles::Copy(std::size_t index, const std::string& path) {
  const std::size_t end = path.rfind('/');
  if (end != std::string::npos) {
    MakeFolder(path.substr(0, end + 1));
  }
  WriteBytes(At(path), templates_->Bytes(index));
  files_[path] = index;
}

void UserFiles::MakeFolder(const std::string& path) {
  fs::create_directories(At(path));
  for (std::size_t end = path.find('/'); end != std::string::npos; end = path.find('/', end + 1)) {
    folders_.insert(path.substr(0, end + 1));
  }
}

/// `from` and `to` are both files or both folders.
void UserFiles::Move(const std::string& from, const std::string& to) {
  fs::rename(At(from), At(to));
  if (!from.ends_with('/')) {
    files_[to] = files_.at(from);
    files_.erase(from);
    return;
  }
  const auto moved = [&](const std::string& path) { return to + path.substr(from.size()); };
  const auto move = [&](std::set<std::string>& paths) {
    std::set<std::string> result;
    for (const std::string& path : paths) {
      result.insert(path.starts_with(from) ? moved(path) : path);
    }
    paths = std::move(result);
  };
  move(folders_);
  move(specials_);
  std::map<std::string, std::size_t> files;
  for (const auto& [path, index] : files_) {
    files[path.starts_with(from) ? moved(path) : path] = index;
  }
  files_ = std::move(files);
}

void UserFiles::Remove(const std::string& path) {
  fs::remove_all(At(path));
  if (!path.ends_with('/')) {
    files_.erase(path);
    return;
  }
  const auto isBelow = [&](const std::string& other) { return other.starts_with(path); };
  std::erase_if(files_, [&](const auto& entry) { return isBelow(entry.first); });
  std::erase_if(folders_, isBelow);
  std::erase_if(specials_, isBelow);
}

// --- Random changes ----------------------------------------------------------------------------

void UserFiles::Change(Random& random, UserFiles& other) {
  const std::size_t kind = random.Below(100);
  if (files_.empty() || (kind < 32 && files_.size() < MOST_FILES)) {
    CopyAny(random);
  } else if (kind < 40 && folders_.size() < MOST_FOLDERS) {
    const std::string path = AnyFolder(random) + random.Of(FOLDERS) + '/';
    if (!IsTaken(path)) {
      MakeFolder(path);
    }
  } else if (kind < 62) {
    MoveFile(random, other);
  } else if (kind < 70) {
    MoveFolder(random);
  } else if (kind < 72) {
    RemoveFolder(random);
  } else if (kind < 80) {
    TouchFile(random);
  } else if (kind < 84) {
    MakeSpecialFile(random);
  } else if (kind < 90) {
    Copy(AnyTemplate(random), AnyFile(random));
  } else {
    Remove(AnyFile(random));
  }
}

/// Copies as cp does, or as programs that write a temporary file first.
void UserFiles::CopyAny(Random& random) {
  const std::string path = NewPath(random);
  const std::size_t index = AnyTemplate(random);
  if (IsTaken(path) && !files_.contains(path)) {
    return;
  }
  if (random.Chance(50)) {
    Copy(index, path);
    return;
  }
  const std::string temporary = path + ".part";
  WriteBytes(At(temporary), templates_->Bytes(index));
  fs::rename(At(temporary), At(path));
  files_[path] = index;
}

void UserFiles::MoveFile(Random& random, UserFiles& other) {
  const std::string from = AnyFile(random);
  if (&other != this && random.Chance(20)) {
    const std::string to = other.NewPath(random);
    if (!other.IsTaken(to)) {
      other.Copy(files_.at(from), to);
      Remove(from);
    }
    return;
  }
  const std::string folder =
      random.Chance(50) ? from.substr(0, from.rfind('/') + 1) : AnyFolder(random);
  const std::string to = folder + random.Of(NAMES);
  if (to != from && (files_.contains(to) || !IsTaken(to))) {
    Move(from, to);
  }
}

void UserFiles::MoveFolder(Random& random) {
  const std::string from = AnyFolder(random);
  const std::string to = AnyFolder(random) + random.Of(FOLDERS) + '/';
  if (!from.empty() && !to.starts_with(from) && !IsTaken(to)) {
    Move(from, to);
  }
}

void UserFiles::RemoveFolder(Random& random) {
  const std::string folder = AnyFolder(random);
  if (!folder.empty()) {
    Remove(folder);
  }
}

/// Gives it another modification time or mode, or another name for a moment.
void UserFiles::TouchFile(Random& random) const {
  const std::string path = At(AnyFile(random));
  switch (random.Below(3)) {
  case 0: {
    const timespec time{.tv_sec = 1'000'000'000 + static_cast<time_t>(random.Below(700'000'000)),
                        .tv_nsec = 0};
    const timespec times[] = {time, time};
    utimensat(AT_FDCWD, path.c_str(), times, 0);
    break;
  }
  case 1:
    chmod(path.c_str(), random.Chance(50) ? 0600 : 0644);
    break;
  default:
    fs::rename(path, path + ".moved");
    fs::rename(path + ".moved", path);
  }
}

/// A link or a FIFO, which are never indexed.
void UserFiles::MakeSpecialFile(Random& random) {
  const std::string path = NewPath(random);
  if (IsTaken(path)) {
    return;
  }
  if (random.Chance(50)) {
    fs::create_symlink("/var/tmp/canary/secret.jpg", At(path));
  } else if (mkfifo(At(path).c_str(), 0644) != 0) {
    throw std::system_error(errno, std::generic_category(), "mkfifo");
  }
  specials_.insert(path);
}

bool UserFiles::IsTaken(const std::string& path) const {
  const std::string plain = path.ends_with('/') ? path.substr(0, path.size() - 1) : path;
  return files_.contains(plain) || specials_.contains(plain) || folders_.contains(plain + '/');
}

/// A folder, or the root, which is empty.
std::string UserFiles::AnyFolder(Random& random) const {
  const std::size_t number = random.Below(folders_.size() + 1);
  return number == folders_.size()
             ? ""
             : *std::next(folders_.begin(), static_cast<std::ptrdiff_t>(number));
}

std::string UserFiles::AnyFile(Random& random) const {
  return std::next(files_.begin(), static_cast<std::ptrdiff_t>(random.Below(files_.size())))->first;
}

std::string UserFiles::NewPath(Random& random) const {
  return AnyFolder(random) + random.Of(NAMES);
}

std::size_t UserFiles::AnyTemplate(Random& random) const {
  return random.Below(templates_->Secret());
}

// --- Model -------------------------------------------------------------------------------------

std::vector<std::string> UserFiles::Differences() const {
  std::vector<std::string> differences;
  std::size_t found = 0;
  for (auto entry = fs::recursive_directory_iterator(root_); entry != fs::end(entry); ++entry) {
    const std::string path = entry->path().native().substr(root_.size() + 1);
    if (path == ".orva" || path == ".zophotos" || (path == "lost+found" && !IsTaken(path))) {
      entry.disable_recursion_pending();
      continue;
    }
    ++found;
    if (const auto file = files_.find(path); file != files_.end()) {
      if (!fs::is_regular_file(entry->symlink_status()) ||
          ReadBytes(entry->path()) != templates_->Bytes(file->second)) {
        differences.push_back("on disk, another content: " + path);
      }
    } else if (!folders_.contains(path + '/') && !specials_.contains(path)) {
      differences.push_back("on disk only: " + path);
    }
  }
  if (found != files_.size() + folders_.size() + specials_.size()) {
    differences.push_back("another number of files on the disk: " + root_);
  }
  return differences;
}

// Neither paths nor numbers contain NUL.
std::string UserFiles::Save() const {
  std::ostringstream text;
  const auto put = [&text](char kind, const std::string& path, std::size_t index) {
    text << kind << index << '\0' << path << '\0';
  };
  for (const auto& [path, index] : files_) {
    put('f', path, index);
  }
  for (const std::string& path : folders_) {
    put('d', path, 0);
  }
  for (const std::string& path : specials_) {
    put('s', path, 0);
  }
  return text.str();
}

void UserFiles::Load(const std::string& saved) {
  std::istringstream text(saved);
  std::string kind;
  std::string path;
  while (std::getline(text, kind, '\0') && std::getline(text, path, '\0')) {
    switch (kind.front()) {
    case 'f':
      files_[path] = std::stoul(kind.substr(1));
      break;
    case 'd':
      folders_.insert(path);
      break;
    default:
      specials_.insert(path);
    }
  }
}

} // namespace orva::test
