#include "FileFaults.h"

#include "FaultVfs.h"

#include <sqlite3.h>

#include <sys/wait.h>
#include <unistd.h>

#include <stdexcept>

namespace orva::test {

namespace {

using Effect = FaultPlan::Effect;

struct Kind {
  const char* name;
  Request request;
  int code;
};

constexpr Kind KINDS[] = {
    {"failed open", Request::Open, SQLITE_CANTOPEN},
    {"failed read", Request::Read, SQLITE_IOERR_READ},
    {"failed write", Request::Write, SQLITE_IOERR_WRITE},
    {"full disk", Request::Write, SQLITE_FULL},
    {"failed sync", Request::Sync, SQLITE_IOERR_FSYNC},
    {"failed truncation", Request::Truncate, SQLITE_IOERR_TRUNCATE},
    {"failed size request", Request::Size, SQLITE_IOERR_FSTAT},
    {"failed lock", Request::Lock, SQLITE_IOERR_LOCK},
    {"lock held by another", Request::Lock, SQLITE_BUSY},
    {"failed deletion", Request::Delete, SQLITE_IOERR_DELETE},
    {"failed access check", Request::Access, SQLITE_IOERR_ACCESS},
    {"failed renaming", Request::Rename, SQLITE_IOERR},
};

/// Requests that change something on disk.
const std::vector<Request> CHANGES = {Request::Open,   Request::Write,    Request::Sync,
                                      Request::Delete, Request::Truncate, Request::Rename};

/// Requests between two changes: a crash there leaves nothing of the next change, not even the
/// first half of a write.
const std::vector<Request> QUERIES = {Request::Read, Request::Size, Request::Lock, Request::Access};

Fault::Tally Run(const FaultPlan& plan, const Action& action) {
  const FaultVfs faults(plan);
  action();
  return {.chances = faults.Seen(), .faults = faults.Failed()};
}

/// Runs the action in a process of its own. The fault is that the plan has ended it.
Fault::Tally RunApart(const FaultPlan& plan, const Action& action) {
  const pid_t child = fork();
  if (child == 0) {
    try {
      Run(plan, action);
      _exit(0);
    } catch (...) {
      _exit(1);
    }
  }
  int status = 0;
  if (child < 0 || waitpid(child, &status, 0) != child || !WIFEXITED(status) ||
      (WEXITSTATUS(status) != 0 && WEXITSTATUS(status) != FaultVfs::CRASHED)) {
    throw std::runtime_error("the process has ended with status " + std::to_string(status));
  }
  return {.chances = 0, .faults = WEXITSTATUS(status) == FaultVfs::CRASHED ? 1 : 0};
}

Fault Error(const Kind& kind, const std::string& files, const std::string& place, bool permanent) {
  return {.name = place + ": " + kind.name + (permanent ? ", permanently" : ", once"),
          .run = [=](int nth, const Action& action) {
            return Run({.files = files,
                        .requests = {kind.request},
                        .nth = nth,
                        .code = kind.code,
                        .permanent = permanent},
                       action);
          }};
}

Fault Crash(const char* name, const FaultPlan& plan) {
  return {.name = name,
          .run =
              [=](int nth, const Action& action) {
                FaultPlan now = plan;
                now.nth = nth;
                return nth == 0 ? Run(now, action) : RunApart(now, action);
              },
          .endsProcess = true};
}

} // namespace

std::vector<Fault> FileErrors(const std::string& files, const std::string& place) {
  std::vector<Fault> faults;
  for (const Kind& kind : KINDS) {
    faults.push_back(Error(kind, files, place, false));
    faults.push_back(Error(kind, files, place, true));
  }
  return faults;
}

std::vector<Fault> Crashes(const std::string& files) {
  return {
      Crash("crashed process", {.files = files, .requests = CHANGES, .effect = Effect::Crash}),
      Crash("crashed process, between changes",
            {.files = files, .requests = QUERIES, .effect = Effect::Crash}),
      Crash("lost power", {.files = files, .requests = CHANGES, .effect = Effect::PowerLoss}),
      Crash("lost power, database kept",
            {.files = files, .requests = CHANGES, .effect = Effect::PowerLoss, .lost = "-journal"}),
      Crash(
          "lost power with names",
          {.files = files, .requests = CHANGES, .effect = Effect::PowerLoss, .losesNames = true})};
}

void LosePowerAfter(const Action& action, const std::string& files) {
  RunApart({.files = files, .effect = FaultPlan::Effect::PowerLoss, .losesNames = true}, [&] {
    action();
    FaultVfs::Current()->Crash();
  });
}

} // namespace orva::test
