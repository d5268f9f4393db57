#include "CacheDirectory.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <algorithm>
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

/// The number of a snapshot's file, or of one that SQLite puts next to it.
std::optional<std::uint64_t> NumberOf(std::string_view name) {
  if (!name.starts_with(BEGIN)) {
    return std::nullopt;
  }
  std::uint64_t number = 0;
  const char* const begin = name.data() + BEGIN.size();
  const char* const end = name.data() + name.size();
  const auto [rest, error] = std::from_chars(begin, end, number);
  if (error != std::errc() || !std::string_view(rest, end).starts_with(END)) {
    return std::nullopt;
  }
  return number;
}

} // namespace

CacheDirectory::CacheDirectory(const std::string& path) {
  if (mkdir(path.c_str(), S_IRWXU) != 0 && errno != EEXIST) {
    Refuse(path, std::generic_category().message(errno));
  }
  const util::FileDescriptor directory(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  struct stat status {};
  if (fstat(directory.Get(), &status) != 0) {
    Refuse(path, std::generic_category().message(errno));
  }
  if (status.st_uid != geteuid()) {
    Refuse(path, "it belongs to another user");
  }
  if ((status.st_mode & (S_IRWXG | S_IRWXO)) != 0 && fchmod(directory.Get(), S_IRWXU) != 0) {
    Refuse(path, std::generic_category().message(errno));
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
  return path_ + '/' + std::string(BEGIN) + std::to_string(number) + std::string(END);
}

std::vector<std::uint64_t> CacheDirectory::Numbers() const {
  std::vector<std::uint64_t> numbers;
  for (const auto& entry : std::filesystem::directory_iterator(path_)) {
    const auto number = NumberOf(entry.path().filename().string());
    if (number && entry.path() == File(*number) &&
        entry.symlink_status().type() == std::filesystem::file_type::regular) {
      numbers.push_back(*number);
    }
  }
  std::ranges::sort(numbers);
  return numbers;
}

void CacheDirectory::RemoveOthers(std::uint64_t kept) const {
  std::vector<std::filesystem::path> others;
  for (const auto& entry : std::filesystem::directory_iterator(path_)) {
    const std::string name = entry.path().filename().string();
    if (name.starts_with(BEGIN) && NumberOf(name) != kept) {
      others.push_back(entry.path());
    }
  }
  for (const auto& other : others) {
    std::filesystem::remove_all(other);
  }
}

} // namespace orva::web
