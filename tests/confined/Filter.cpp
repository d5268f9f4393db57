#include "Filter.h"

#include <seccomp.h>
#include <sys/mman.h>
#include <sys/shm.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <fcntl.h>
#include <fstream>
#include <map>
#include <sched.h>
#include <set>
#include <sstream>
#include <stdexcept>
#include <vector>

namespace orva::test {

namespace {

using Groups = std::map<std::string, std::vector<std::string>>;

void Check(int result, const std::string& what) {
  if (result < 0) {
    throw std::runtime_error(what + ": " + std::strerror(-result));
  }
}

/// A name in the first column begins a group; its members stand below it, further in.
Groups ReadGroups(const std::string& path) {
  std::ifstream file(path);
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

void Expand(const Groups& groups, const std::string& name, std::set<std::string>& calls) {
  if (!name.starts_with('@')) {
    calls.insert(name);
    return;
  }
  for (const std::string& member : groups.at(name)) {
    Expand(groups, member, calls);
  }
}

/// The calls on the list of the unit: the first value says what is allowed, those behind it add to
/// that or, with a tilde, take from it.
std::set<std::string> AllowedCalls(const Unit& unit, const Groups& groups) {
  std::set<std::string> allowed;
  Expand(groups, "@default", allowed);
  for (const std::string& value : unit.All("SystemCallFilter")) {
    const bool takes = value.starts_with('~');
    std::istringstream words(value.substr(takes ? 1 : 0));
    for (std::string word; words >> word;) {
      std::set<std::string> calls;
      Expand(groups, word, calls);
      if (takes) {
        std::erase_if(allowed, [&calls](const auto& call) { return calls.contains(call); });
      } else {
        allowed.merge(calls);
      }
    }
  }
  return allowed;
}

/// One filter of the kernel's, which holds beside all others; the strictest answer counts.
class Filter {
public:
  explicit Filter(std::uint32_t otherwise) : context_(seccomp_init(otherwise)) {
    if (context_ == nullptr) {
      throw std::runtime_error("seccomp_init");
    }
    Check(seccomp_attr_set(context_, SCMP_FLTATR_CTL_NNP, 0), "seccomp_attr_set");
  }
  Filter(const Filter&) = delete;
  Filter& operator=(const Filter&) = delete;
  ~Filter() { seccomp_release(context_); }

  /// Calls that this machine does not have are left out.
  void Add(std::uint32_t action, const std::string& call,
           const std::vector<scmp_arg_cmp>& arguments = {}) {
    const int number = seccomp_syscall_resolve_name(call.c_str());
    if (number >= 0) {
      Check(seccomp_rule_add_array(context_, action, number,
                                   static_cast<unsigned>(arguments.size()), arguments.data()),
            call);
    }
  }

  void Load() { Check(seccomp_load(context_), "seccomp_load"); }

private:
  scmp_filter_ctx context_; ///< owned
};

scmp_arg_cmp Has(unsigned argument, std::uint64_t bits) {
  return {argument, SCMP_CMP_MASKED_EQ, bits, bits};
}

void AddRestrictions(const Unit& unit, Filter& filter) {
  const std::uint32_t refuse = SCMP_ACT_ERRNO(EPERM);
  if (unit.Words("RestrictAddressFamilies") == std::vector<std::string>{"AF_UNIX"}) {
    filter.Add(SCMP_ACT_ERRNO(EAFNOSUPPORT), "socket", {{0, SCMP_CMP_LT, AF_UNIX, 0}});
    filter.Add(SCMP_ACT_ERRNO(EAFNOSUPPORT), "socket", {{0, SCMP_CMP_GT, AF_UNIX, 0}});
  }
  if (unit.Is("MemoryDenyWriteExecute")) {
    filter.Add(refuse, "mmap", {Has(2, PROT_WRITE | PROT_EXEC)});
    filter.Add(refuse, "mprotect", {Has(2, PROT_EXEC)});
    filter.Add(refuse, "pkey_mprotect", {Has(2, PROT_EXEC)});
    filter.Add(refuse, "shmat", {Has(2, SHM_EXEC)});
  }
  if (unit.Is("RestrictNamespaces")) {
    for (const std::uint64_t kind : {CLONE_NEWCGROUP, CLONE_NEWIPC, CLONE_NEWNET, CLONE_NEWNS,
                                     CLONE_NEWPID, CLONE_NEWUSER, CLONE_NEWUTS}) {
      filter.Add(refuse, "unshare", {Has(0, kind)});
      filter.Add(refuse, "clone", {Has(0, kind)});
    }
    filter.Add(refuse, "setns");
    filter.Add(SCMP_ACT_ERRNO(ENOSYS), "clone3"); // its arguments cannot be looked at
  }
  if (unit.Is("RestrictRealtime")) {
    filter.Add(refuse, "sched_setscheduler", {{1, SCMP_CMP_EQ, SCHED_FIFO, 0}});
    filter.Add(refuse, "sched_setscheduler", {{1, SCMP_CMP_EQ, SCHED_RR, 0}});
  }
  if (unit.Is("LockPersonality")) {
    filter.Add(refuse, "personality");
  }
  if (unit.Is("RestrictSUIDSGID")) {
    for (const std::uint64_t bit : {S_ISUID, S_ISGID}) {
      for (const char* const call : {"chmod", "fchmod", "mkdir", "mknod", "creat"}) {
        filter.Add(refuse, call, {Has(1, bit)});
      }
      for (const char* const call : {"fchmodat", "mkdirat", "mknodat"}) {
        filter.Add(refuse, call, {Has(2, bit)});
      }
      filter.Add(refuse, "open", {Has(1, O_CREAT), Has(2, bit)});
      filter.Add(refuse, "openat", {Has(2, O_CREAT), Has(3, bit)});
    }
    filter.Add(SCMP_ACT_ERRNO(ENOSYS), "openat2");
  }
}

} // namespace

void FilterSystemCalls(const Unit& unit, const std::string& groups) {
  // Both are made before the first one holds, which forbids to load another.
  Filter restrictions(SCMP_ACT_ALLOW);
  AddRestrictions(unit, restrictions);
  Filter list(SCMP_ACT_KILL_PROCESS);
  for (const std::string& call : AllowedCalls(unit, ReadGroups(groups))) {
    list.Add(SCMP_ACT_ALLOW, call);
  }
  restrictions.Load();
  list.Load();
}

} // namespace orva::test
