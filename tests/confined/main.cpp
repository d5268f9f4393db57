// confine COMMAND [ARGUMENT...]: becomes the command, confined as the daemon's unit says.
//
// For the tests that start the daemon themselves, without a systemd. What is applied here is
// applied as systemd does it; tests/package has the rest, under a real one. Linked statically, so
// that what a test preloads into the daemon leaves it alone.
#include "Filter.h"
#include "Root.h"
#include "Unit.h"

#include <linux/capability.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <exception>
#include <iostream>
#include <set>
#include <stdexcept>
#include <string>
#include <string_view>

namespace {

using namespace orva::test;

/// How the service is run, which is the test's affair here.
const std::set<std::string> RUN = {"ExecStart",      "Restart",          "RestartSec",
                                   "Type",           "RuntimeDirectory", "WorkingDirectory",
                                   "StandardOutput", "StandardError"};

const std::set<std::string> APPLIED = {"CapabilityBoundingSet",
                                       "InaccessiblePaths",
                                       "LockPersonality",
                                       "MemoryDenyWriteExecute",
                                       "NoNewPrivileges",
                                       "PrivateIPC",
                                       "PrivateMounts",
                                       "PrivateNetwork",
                                       "PrivateTmp",
                                       "ProtectHome",
                                       "ProtectHostname",
                                       "ProtectKernelTunables",
                                       "ProtectSystem",
                                       "ReadOnlyPaths",
                                       "RestrictAddressFamilies",
                                       "RestrictNamespaces",
                                       "RestrictRealtime",
                                       "RestrictSUIDSGID",
                                       "SystemCallArchitectures",
                                       "SystemCallFilter",
                                       "UMask"};

/// Follow from the capabilities and system calls that are left.
const std::set<std::string> IMPLIED = {"ProtectClock", "ProtectKernelLogs", "ProtectKernelModules"};

/// Control groups, a /dev and a /proc that a process cannot give itself, what comes at the end.
const std::set<std::string> NOT_APPLIED = {
    "DevicePolicy", "IPAddressDeny",        "KeyringMode", "PrivateDevices",
    "ProcSubset",   "ProtectControlGroups", "ProtectProc", "RemoveIPC"};

/// A setting that is new to the unit must not be believed to be applied.
void CheckSettings(const Unit& unit) {
  for (const std::string& name : unit.Names()) {
    if (!RUN.contains(name) && !APPLIED.contains(name) && !IMPLIED.contains(name) &&
        !NOT_APPLIED.contains(name)) {
      throw std::runtime_error("nobody has said whether this applies " + name);
    }
  }
  if (unit.Is("PrivateTmp") ||
      unit.Words("SystemCallArchitectures") != std::vector<std::string>{"native"}) {
    throw std::runtime_error("a setting has a value that is not applied");
  }
}

int Capability(const std::string& name) {
  constexpr std::array<std::pair<std::string_view, int>, 4> CAPABILITIES = {
      {{"CAP_CHOWN", CAP_CHOWN},
       {"CAP_DAC_OVERRIDE", CAP_DAC_OVERRIDE},
       {"CAP_FOWNER", CAP_FOWNER},
       {"CAP_FSETID", CAP_FSETID}}};
  for (const auto& [known, number] : CAPABILITIES) {
    if (known == name) {
      return number;
    }
  }
  throw std::runtime_error("unknown capability " + name);
}

/// The bounding set is what root has of its capabilities once it has become the command.
void DropCapabilities(const Unit& unit) {
  std::set<int> kept;
  for (const std::string& name : unit.Words("CapabilityBoundingSet")) {
    kept.insert(Capability(name));
  }
  for (int capability = 0; prctl(PR_CAPBSET_READ, capability) >= 0; ++capability) {
    if (!kept.contains(capability) && prctl(PR_CAPBSET_DROP, capability) != 0) {
      throw std::runtime_error("PR_CAPBSET_DROP");
    }
  }
}

void Confine(const Unit& unit) {
  CheckSettings(unit);
  ConfineRoot(unit, KEPT);
  umask(static_cast<mode_t>(std::stoul(unit.Words("UMask").at(0), nullptr, 8)));
  DropCapabilities(unit);
  if (unit.Is("NoNewPrivileges") && prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) {
    throw std::runtime_error("PR_SET_NO_NEW_PRIVS");
  }
  FilterSystemCalls(unit, GROUPS);
}

} // namespace

int main(int count, char* arguments[]) {
  constexpr int FAILURE = 99; // the daemon knows no such status
  if (count < 2) {
    std::cerr << "usage: confine COMMAND [ARGUMENT...]\n";
    return FAILURE;
  }
  try {
    Confine(Unit(UNIT));
  } catch (const std::exception& error) {
    std::cerr << "confine: " << error.what() << '\n';
    return FAILURE;
  }
  execv(arguments[1], arguments + 1);
  std::cerr << "confine: cannot run " << arguments[1] << '\n';
  return FAILURE;
}
