// confine COMMAND [ARGUMENT...]: becomes the command, with the system call filters of the daemon's
// unit.
//
// The tests that start the daemon without systemd can start it with this program (DaemonProcess.h),
// and so run all of the daemon's code under the filters. It applies SystemCallFilter=,
// RestrictAddressFamilies= and MemoryDenyWriteExecute= of the unit file. libseccomp adds
// NoNewPrivileges=yes and SystemCallArchitectures=native. tests/package/inside covers the rest of
// the unit under a real systemd: the capabilities, the read-only and inaccessible paths, the
// namespaces.
//
// Linked statically, so that the libraries that a test preloads into the daemon do not affect it.

#include <seccomp.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <exception>
#include <fstream>
#include <iostream>
#include <map>
#include <memory>
#include <set>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

namespace {

using Words = std::vector<std::string>;
using Groups = std::map<std::string, Words>;

/// The values of a setting of the unit, in their order.
Words Values(const std::string& setting) {
  std::ifstream file(UNIT);
  Words values;
  for (std::string line; std::getline(file, line);) {
    if (line.starts_with(setting + "=")) {
      values.push_back(line.substr(setting.size() + 1));
    }
  }
  if (values.empty()) {
    throw std::runtime_error("there is no " + setting + "= in " UNIT);
  }
  return values;
}

void ExpectValue(const std::string& setting, const std::string& value) {
  if (Values(setting) != Words{value}) {
    throw std::runtime_error(setting + "= is not " + value);
  }
}

/// Reads what `systemd-analyze syscall-filter` prints: the name of a group in the first column, its
/// members indented below it.
Groups ReadGroups() {
  std::ifstream file(GROUPS);
  Groups groups;
  std::string group;
  for (std::string line; std::getline(file, line);) {
    std::string name;
    std::istringstream(line) >> name;
    if (line.starts_with('@')) {
      group = name;
    } else if (line.starts_with(' ') && !name.starts_with('#')) {
      groups[group].push_back(name);
    }
  }
  return groups;
}

/// Adds the system call `name`, or those of the group `name`.
void Expand(const Groups& groups, const std::string& name, std::set<std::string>& calls) {
  if (!name.starts_with('@')) {
    calls.insert(name);
    return;
  }
  for (const std::string& member : groups.at(name)) {
    Expand(groups, member, calls);
  }
}

/// The system calls that the unit allows. The first value of the setting is a list of allowed
/// calls; the later ones add to it or, with a tilde, remove from it.
std::set<std::string> AllowedCalls() {
  const Groups groups = ReadGroups();
  std::set<std::string> allowed;
  Expand(groups, "@default", allowed);
  for (const std::string& value : Values("SystemCallFilter")) {
    const bool removes = value.starts_with('~');
    std::istringstream words(value.substr(removes ? 1 : 0));
    for (std::string word; words >> word;) {
      std::set<std::string> calls;
      Expand(groups, word, calls);
      if (removes) {
        std::erase_if(allowed, [&calls](const auto& call) { return calls.contains(call); });
      } else {
        allowed.merge(calls);
      }
    }
  }
  return allowed;
}

/// A filter of the kernel. A process may have several; the strictest result counts.
class Filter {
public:
  /// `otherwise` is the action for calls without a rule.
  explicit Filter(std::uint32_t otherwise) : context_(seccomp_init(otherwise), seccomp_release) {}

  /// Adds a rule. Ignores calls that this architecture does not have.
  void Add(std::uint32_t action, const std::string& call,
           const std::vector<scmp_arg_cmp>& arguments = {}) {
    const int number = seccomp_syscall_resolve_name(call.c_str());
    if (number >= 0) {
      Check(seccomp_rule_add_array(context_.get(), action, number,
                                   static_cast<unsigned>(arguments.size()), arguments.data()));
    }
  }

  void Load() { Check(seccomp_load(context_.get())); }

private:
  static void Check(int result) {
    if (result < 0) {
      throw std::runtime_error(std::strerror(-result));
    }
  }

  std::unique_ptr<void, decltype(&seccomp_release)> context_;
};

void FilterSystemCalls() {
  ExpectValue("NoNewPrivileges", "yes");
  ExpectValue("SystemCallArchitectures", "native");
  // As systemd does: a rule on arguments returns an error; a forbidden call kills the process.
  Filter restrictions(SCMP_ACT_ALLOW);
  ExpectValue("RestrictAddressFamilies", "AF_UNIX");
  restrictions.Add(SCMP_ACT_ERRNO(EAFNOSUPPORT), "socket", {{0, SCMP_CMP_NE, AF_UNIX, 0}});
  ExpectValue("MemoryDenyWriteExecute", "yes");
  constexpr std::uint64_t BOTH = PROT_WRITE | PROT_EXEC;
  restrictions.Add(SCMP_ACT_ERRNO(EPERM), "mmap", {{2, SCMP_CMP_MASKED_EQ, BOTH, BOTH}});
  for (const char* const call : {"mprotect", "pkey_mprotect"}) {
    restrictions.Add(SCMP_ACT_ERRNO(EPERM), call, {{2, SCMP_CMP_MASKED_EQ, PROT_EXEC, PROT_EXEC}});
  }
  Filter list(SCMP_ACT_KILL_PROCESS);
  for (const std::string& call : AllowedCalls()) {
    list.Add(SCMP_ACT_ALLOW, call);
  }
  // Loaded last, because it forbids loading another filter.
  restrictions.Load();
  list.Load();
}

} // namespace

int main(int count, char* arguments[]) {
  constexpr int FAILURE = 99; // not a status of the daemon
  if (count < 2) {
    std::cerr << "usage: confine COMMAND [ARGUMENT...]\n";
    return FAILURE;
  }
  try {
    FilterSystemCalls();
  } catch (const std::exception& error) {
    std::cerr << "confine: " << error.what() << '\n';
    return FAILURE;
  }
  execv(arguments[1], arguments + 1);
  std::cerr << "confine: cannot run " << arguments[1] << '\n';
  return FAILURE;
}
