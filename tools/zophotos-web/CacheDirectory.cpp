#include "CacheDirectory.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <filesystem>
#include <optional>
#include <stdexcept>
#include <string_view>
#include <system_error>

namespace orva::web {

namespace {

constexpr std::string_view BEGIN = "snapshot-";
constexpr std::string_view END = ".db";

[[noreturn]] void Refuse(const std::string& path, const std::string& reason) {
  throw std::runtime_error("cannot use the cache directory " + path + ": " + reason);
}

/// What the names of a snapshot's file and of those that SQLite puts next to it end with.
constexpr std::array<std::string_view, 4> SUFFIXES{"", "-journal", "-shm", "-wal"};

std::string NameOf(std::uint64_t number) {
  return std::string(BEGIN) + std::to_string(number) + std::string(END);
}

/// The number of a snapshot's file, or of one that SQLite puts next to it.
std::optional<std::uint64_t> NumberOf(std::string_view name) {
  if (!name.starts_with(BEGIN)) {
    return std::nullopt;
  }
  std::uint64_t number = 0;
  const char* const begin = name.data() + BEGIN.size();
  const auto [rest, error] = std::from_chars(begin, name.data() + name.size(), number);
  if (error != std::errc()) {
    return std::nullopt;
  }
  const bool isOurs = std::ranges::any_of(
      SUFFIXES, [&](std::string_view suffix) { return name == NameOf(number).append(suffix); });
  return isOurs ? std::optional(number) : std::nullopt;
}

bool IsRegular(const std::filesystem::directory_entry& entry) {
  return entry.symlink_status().type() == std::filesystem::file_type::regular;
}

} // namespace

CacheDirectory::CacheDirectory(const std::string& path) {
  if (mkdir(path.c_str(), S_IRWXU) != 0 && errno != EEXIST) {
    Refuse(path, std::generic_category().message(errno));
  }
  const util::FileDescriptor directory(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  struct stat status {};
  if (!directory || fstat(directory.Get(), &status) != 0) {
    Refuse(path, std::generic_category().message(errno));
  }
  if (status.st_uid != geteuid()) {
    Refuse(path, "it belongs to another user");
  }
  if ((status.st_mode & (S_IRWXG | S_IRWXO)) != 0) {
    Refuse(path, "other users may use it; name a directory that does not exist yet or has mode "
                 "0700");
  }
  lock_.Reset(openat(directory.Get(), "lock",
                     O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, S_IRUSR | S_IWUSR));
  if (!lock_) {
    Refuse(path, "lock: " + std::generic_category().message(errno));
  }
  if (flock(lock_.Get(), LOCK_EX | LOCK_NB) != 0) {
    Refuse(path, errno == EWOULDBLOCK ? "another process uses it"
                                      : "lock: " + std::generic_category().message(errno));
  }
  path_ = std::filesystem::canonical(path).string();
}

std::string CacheDirectory::File(std::uint64_t number) const {
  return path_ + '/' + NameOf(number);
}

std::vector<std::uint64_t> CacheDirectory::Numbers() const {
  std::vector<std::uint64_t> numbers;
  for (const auto& entry : std::filesystem::directory_iterator(path_)) {
    const auto number = NumberOf(entry.path().filename().string());
    if (number && entry.path() == File(*number) && IsRegular(entry)) {
      numbers.push_back(*number);
    }
  }
  std::ranges::sort(numbers);
  return numbers;
}

std::uint64_t CacheDirectory::FreeNumber(std::uint64_t after) const {
  const auto isTaken = [this](std::uint64_t number) {
    return std::ranges::any_of(SUFFIXES, [&](std::string_view suffix) {
      const std::string name = File(number).append(suffix);
      return std::filesystem::exists(std::filesystem::symlink_status(name));
    });
  };
  std::uint64_t number = after + 1;
  while (isTaken(number)) {
    ++number;
  }
  return number;
}

void CacheDirectory::RemoveOthers(std::uint64_t kept) const {
  std::vector<std::filesystem::path> others;
  for (const auto& entry : std::filesystem::directory_iterator(path_)) {
    const auto number = NumberOf(entry.path().filename().string());
    if (number && *number != kept && IsRegular(entry)) {
      others.push_back(entry.path());
    }
  }
  for (const auto& other : others) {
    std::filesystem::remove(other);
  }
}

} // namespace orva::web
