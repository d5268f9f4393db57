// An untrusted user who replaces names as fast as possible, until standard input ends. The command
// line has groups of arguments, separated by "--": the directory of the private files, a pool
// directory on the same file system, and the paths to replace. Says "ready" once the pool is full,
// and at the end how many names it has replaced.

#include "Replacement.h"

#include <fcntl.h>
#include <grp.h>
#include <poll.h>
#include <sys/prctl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <iostream>
#include <random>

namespace {

using namespace orva::test;
namespace fs = std::filesystem;

// The daemon finds nothing to open when it never finds the right file first. So most replacements
// are in place only for a moment, at most as long as these numbers of microseconds.
constexpr unsigned LONGEST_REPLACEMENT = 60;
constexpr unsigned LONGEST_PAUSE = 300;
/// One of so many is left there.
constexpr unsigned LEFT = 64;
constexpr int CHANGES_BETWEEN_REFILLS = 200;

/// Spends up to `longest` microseconds without giving the processor away.
void Spin(std::mt19937& random, unsigned longest) {
  const auto end =
      std::chrono::steady_clock::now() + std::chrono::microseconds(random() % (longest + 1));
  while (std::chrono::steady_clock::now() < end) {
  }
}

/// Replaces names on one file system with what is in a pool.
class Group {
public:
  /// `arguments` as on the command line. Throws std::system_error.
  explicit Group(const std::vector<std::string>& arguments)
      : files_(arguments.at(0)), pool_(arguments.at(1)),
        places_(arguments.begin() + 2, arguments.end()) {
    for (const auto& entry : fs::directory_iterator(pool_)) {
      paths_.push_back(entry.path()); // hard links, which only root can make
    }
    for (const std::string& place : places_) {
      const std::string name = fs::path(place).filename();
      for (const Replacement kind : REPLACEMENTS) {
        if (kind != Replacement::HardLink && IsFor(kind, name)) {
          slots_.push_back({.kind = kind, .name = name, .path = pool_ + "/" + name + NameOf(kind)});
          paths_.push_back(slots_.back().path);
        }
      }
    }
  }

  /// Makes again what the daemon has removed, and takes back the leases that it has broken.
  void Refill() {
    for (Slot& slot : slots_) {
      if (!fs::exists(fs::symlink_status(slot.path))) {
        try {
          slot.held = MakeReplacement(slot.kind, slot.path, slot.name, files_);
        } catch (const std::exception&) {
          // It is not the only one.
        }
      }
      if (slot.kind == Replacement::LeasedFile) {
        fcntl(slot.held.Get(), F_SETLEASE, F_WRLCK);
      }
    }
  }

  /// Replaces a name by something in the pool, or by nothing. Returns the number of changes. None
  /// of them has to succeed.
  int Change(std::mt19937& random) {
    const std::string& place = places_[random() % places_.size()];
    const std::string& path = paths_[random() % paths_.size()];
    const bool back = random() % LEFT != 0;
    int changes = Exchange(path, place) ? 1 : 0;
    Spin(random, LONGEST_REPLACEMENT);
    if (back) {
      changes += Exchange(path, place) ? 1 : 0;
    }
    return changes;
  }

private:
  /// Exchanges two paths, of which one may be absent.
  static bool Exchange(const std::string& first, const std::string& second) {
    const auto change = [](const std::string& from, const std::string& to, unsigned flags) {
      return renameat2(AT_FDCWD, from.c_str(), AT_FDCWD, to.c_str(), flags) == 0;
    };
    return change(first, second, RENAME_EXCHANGE) || change(first, second, RENAME_NOREPLACE) ||
           change(second, first, RENAME_NOREPLACE);
  }

  /// A replacement that is made again. After exchanges something else is at its path.
  struct Slot {
    Replacement kind;
    std::string name;
    std::string path;
    orva::util::FileDescriptor held{};
  };

  std::string files_;
  std::string pool_;
  std::vector<std::string> places_;
  std::vector<Slot> slots_;
  std::vector<std::string> paths_; ///< in the pool
};

/// The groups of the command line.
std::vector<Group> Groups(const std::vector<std::string>& arguments) {
  std::vector<Group> groups;
  for (auto begin = arguments.begin(); begin < arguments.end();) {
    const auto end = std::find(begin, arguments.end(), "--");
    groups.emplace_back(std::vector(begin, end));
    begin = end == arguments.end() ? end : end + 1;
  }
  return groups;
}

bool HasEnded(int descriptor) {
  pollfd input{descriptor, POLLIN, 0};
  return poll(&input, 1, 0) != 0;
}

} // namespace

int main(int count, char** arguments) {
  if (setgroups(0, nullptr) != 0 ||
      setresgid(UNTRUSTED_USER, UNTRUSTED_USER, UNTRUSTED_USER) != 0 ||
      setresuid(UNTRUSTED_USER, UNTRUSTED_USER, UNTRUSTED_USER) != 0) {
    std::cout << "this user cannot become another one: " << std::strerror(errno) << std::endl;
    return EXIT_FAILURE;
  }
  // The leak sanitizer reads the memory of its own process.
  prctl(PR_SET_DUMPABLE, 1);
  std::vector<Group> groups = Groups({arguments + 1, arguments + count});
  long changes = 0;
  std::mt19937 random(std::random_device{}());
  for (bool ready = false; !HasEnded(STDIN_FILENO);) {
    for (Group& group : groups) {
      group.Refill();
    }
    if (!std::exchange(ready, true)) {
      std::cout << "ready" << std::endl;
    }
    for (int i = 0; i < CHANGES_BETWEEN_REFILLS; ++i) {
      changes += groups[random() % groups.size()].Change(random);
      Spin(random, LONGEST_PAUSE);
    }
  }
  std::cout << changes << std::endl;
}
