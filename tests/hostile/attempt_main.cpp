// Does operations with the daemon's own classes. The command line names them in threes (operation,
// master, volume). Reports on standard output what each has thrown, a line each, and then the peak
// of its memory. The lines that the daemon's classes print are dropped.

#include "DBMerger.h"
#include "PhotoDB.h"
#include "Util.h"

#include "orvautil/FileDescriptor.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstring>
#include <fstream>
#include <functional>
#include <map>

namespace {

using namespace orva;
using Action = std::function<void(const std::string& master, const std::string& volume)>;

/// The beginning of a message, on one line.
std::string Beginning(std::string message) {
  constexpr std::size_t enough = 400;
  message.resize(std::min(message.size(), enough));
  for (char& byte : message) {
    byte = byte == '\n' ? ' ' : byte;
  }
  return message;
}

std::string Thrown(const Action& action, const char* master, const char* volume) {
  try {
    action(master, volume);
    return {};
  } catch (const std::string& error) {
    return "std::string: " + Beginning(error);
  } catch (const dbmerger::PhotoDB::Error& error) {
    return "PhotoDB::Error: " + Beginning(error.Message());
  } catch (const std::exception& error) {
    return std::string("std::exception: ") + Beginning(error.what());
  }
}

/// Takes standard output over for the report, and sends what is printed to /dev/null.
util::FileDescriptor TakeStandardOutput() {
  util::FileDescriptor report(dup(STDOUT_FILENO));
  const util::FileDescriptor nowhere(open("/dev/null", O_WRONLY | O_CLOEXEC));
  if (!report || dup2(nowhere.Get(), STDOUT_FILENO) == -1) {
    _exit(2);
  }
  return report;
}

void Report(const util::FileDescriptor& report, const std::string& line) {
  const std::string whole = line + "\n";
  if (write(report.Get(), whole.data(), whole.size()) != static_cast<ssize_t>(whole.size())) {
    _exit(2);
  }
}

long long PeakMemory() {
  std::ifstream status("/proc/self/status");
  long long kilobytes = 0;
  for (std::string word; status >> word;) {
    if (word == "VmHWM:") {
      status >> kilobytes;
    }
  }
  return kilobytes * 1024;
}

} // namespace

int main(int count, char** arguments) {
  const util::FileDescriptor report = TakeStandardOutput();
  dbmerger::DBMerger merger;
  const std::map<std::string, Action> actions = {
      {"merge", [&](const auto& master, const auto& volume) { merger.MergeDB(master, volume); }},
      {"remerge",
       [&](const auto& master, const auto& volume) { merger.ReMergeDB(master, volume); }},
      {"remove",
       [&](const auto& master, const auto& volume) { merger.RemoveVolume(master, volume); }},
      {"init", [](const auto& master, const auto&) { dbmerger::PhotoDB(master).Init(); }},
      {"locate", [](const auto& master, const auto&) { dbmerger::updateLocatorFile(master); }},
  };
  for (int i = 1; i + 2 < count; i += 3) {
    Report(report, Thrown(actions.at(arguments[i]), arguments[i + 1], arguments[i + 2]));
  }
  merger.stopRequested = true;
  merger.Wait();
  Report(report, "peak " + std::to_string(PeakMemory()));
}
