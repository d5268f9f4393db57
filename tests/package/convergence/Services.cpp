#include "Services.h"

#include "endurance/KnownLines.h"
#include "transcoder/Photos.h"

#include <nlohmann/json.hpp>

#include <syslog.h>

#include <algorithm>
#include <array>
#include <csignal>
#include <sstream>
#include <stdexcept>

namespace orva::test {
namespace {

constexpr char CURSOR[] = "/run/package/journal.cursor";

std::string RunSystemctl(const std::vector<std::string>& arguments) {
  std::vector<std::string> command = {"systemctl"};
  command.insert(command.end(), arguments.begin(), arguments.end());
  return RunChecked(command);
}

std::string Text(const nlohmann::json& entry, const char* field) {
  const auto value = entry.find(field);
  if (value == entry.end() || value->is_null()) {
    return "";
  }
  if (value->is_array()) { // bytes that are no UTF-8
    std::string bytes;
    for (const int byte : *value) {
      bytes += static_cast<char>(byte);
    }
    return bytes;
  }
  return *value;
}

/// The usual lines of the services and, about them, of systemd.
const std::map<std::string, std::regex>& UsualLines() {
  static const std::map<std::string, std::regex> LINES = {
      {"orva-notify",
       std::regex("listening on .*|stopped|client \\d+ (connected|gone|is an observer)|"
                  "sent to .*|(un)?plugged seen: .*|handled by .*|"
                  "/shares/[^ ]* does not exist: waiting for it")},
      {"orva-indexer",
       std::regex("Volume [^ ]*: (walking|gone|walked \\d+ folders, \\d+ files in [\\d.]+ s|"
                  "indexed again)")},
      {"systemd",
       std::regex(
           "(Starting|Started|Stopping|Stopped) .*|.*: Deactivated successfully\\.|"
           ".*: Consumed .* CPU time.*|.*: Scheduled restart job, .*|"
           ".*: Main process exited, code=killed, status=9/KILL|"
           ".*: Killing process \\d+ \\([^)]*\\) with signal SIGKILL\\.|"
           ".*: Failed with result 'signal'\\.|"
           ".* was skipped because of an unmet condition check \\(ConditionPathExists=.*\\)\\.")},
  };
  return LINES;
}

/// journald removes blanks and line ends at the end of a line.
bool IsKnownLineOfDaemon(const LogLine& line) {
  static const KnownLines KNOWN("/run/package/operations.md");
  return std::ranges::any_of(std::array{"", " ", "\n", " \n"}, [&line](const char* end) {
    return KNOWN.Contains({line.priority, line.text + end});
  });
}

bool IsUsual(const nlohmann::json& entry) {
  const std::string program = Text(entry, "SYSLOG_IDENTIFIER");
  const std::string text = Text(entry, "MESSAGE");
  if (program == "zophotodbmerger") {
    const int priority = std::stoi("0" + Text(entry, "PRIORITY"));
    const int facility = std::stoi("0" + Text(entry, "SYSLOG_FACILITY"));
    return priority > LOG_ERR && IsKnownLineOfDaemon({facility << 3 | priority, text});
  }
  const auto usual = UsualLines().find(program);
  return usual != UsualLines().end() && std::regex_match(text, usual->second);
}

} // namespace

Services::Services() {
  UnexpectedLines(); // begins here
}

const std::vector<std::string>& Services::Units() {
  static const std::vector<std::string> UNITS = {"zophotodbmerger", "orva-notify", "orva-indexer",
                                                 "orva-transcoder"};
  return UNITS;
}

std::string Services::Property(const std::string& unit, const std::string& name) {
  std::string value = RunSystemctl({"show", "--property", name, "--value", unit});
  value.erase(std::min(value.find('\n'), value.size()));
  return value;
}

pid_t Services::MainPid(const std::string& unit) {
  return std::stoi(Property(unit, "MainPID"));
}

void Services::Kill(const std::string& unit) {
  const pid_t process = MainPid(unit);
  if (process == 0 || kill(process, SIGKILL) != 0) {
    throw std::runtime_error("no process of " + unit);
  }
  killedProcess_[unit] = process;
  ++restarts_[unit];
  ++kills_;
}

void Services::Control(const std::string& verb, const std::string& unit) {
  RunSystemctl({verb, unit});
  CountFromNow(unit);
}

void Services::CountFromNow(const std::string& unit) {
  RunSystemctl({"reset-failed", unit});
  restarts_[unit] = 0;
}

bool Services::AreActive() const {
  return std::ranges::all_of(Units(), [this](const std::string& unit) {
    const auto killed = killedProcess_.find(unit);
    const pid_t process = MainPid(unit);
    return Property(unit, "ActiveState") == "active" && process != 0 &&
           (killed == killedProcess_.end() || killed->second != process);
  });
}

Services::Lines Services::Problems() const {
  Lines problems;
  for (const std::string& unit : Units()) {
    const std::string state = Property(unit, "ActiveState");
    if (state != "active") {
      problems.push_back(unit + " is " + state);
    }
    const auto expected = restarts_.find(unit);
    const int restarts = expected == restarts_.end() ? 0 : expected->second;
    const std::string found = Property(unit, "NRestarts");
    if (found != std::to_string(restarts)) {
      problems.push_back(unit + " was restarted " + found + " times, not " +
                         std::to_string(restarts));
    }
  }
  return problems;
}

Services::Lines Services::UnexpectedLines(const std::string& expected) {
  RunChecked({"journalctl", "--sync"});
  std::vector<std::string> command = {"journalctl", "--quiet", "--output", "json",
                                      std::string("--cursor-file=") + CURSOR};
  for (const std::string& unit : Units()) {
    command.push_back("--unit=" + unit);
  }
  std::istringstream entries(RunChecked(command));
  const std::regex alsoExpected(expected);
  Lines lines;
  for (std::string line; std::getline(entries, line);) {
    const auto entry = nlohmann::json::parse(line);
    const std::string text = Text(entry, "MESSAGE");
    if (!IsUsual(entry) && (expected.empty() || !std::regex_search(text, alsoExpected))) {
      lines.push_back(Text(entry, "SYSLOG_IDENTIFIER") + ": " + text);
    }
  }
  return lines;
}

bool Services::HasLogged(const std::string& unit, const std::string& text) {
  return RunChecked({"journalctl", "--quiet", "--output", "cat", "--unit", unit}).find(text) !=
         std::string::npos;
}

} // namespace orva::test
