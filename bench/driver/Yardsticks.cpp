#include "Yardsticks.h"

#include "Median.h"
#include "ReaderStatements.h"

#include "support/Program.h"

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string>
#include <vector>

namespace orva::bench {

namespace {

using Command = std::vector<std::string>;

const std::string SHELL = "sqlite3";
const Command SHELL_START{SHELL, ":memory:", ".read /dev/null"};
const std::string SCHEMA = "bench/schema.sql";
const std::string MERGE_SCRIPT = "bench/horizon/merge.sql";
const std::string ADD_SCRIPT = "bench/horizon/add.sql";
const std::string IDS_SCRIPT = "bench/deletion/ids.sql";
const std::string DELETE_SCRIPT = "bench/deletion/delete.sql";
const std::string READER_SCRIPT = "/tmp/reader.sql";

/// The seconds from before the start of a program to after its end, with its standard output in
/// /dev/null, as the daemon's. Throws std::runtime_error unless it ends with status 0.
double RunTime(const Command& command) {
  constexpr std::chrono::hours LIMIT{24};
  const auto begin = std::chrono::steady_clock::now();
  test::Program program(command,
                        {.output = "/dev/null", .errors = test::Program::Errors::Inherited});
  const int status = program.WaitForEnd(LIMIT);
  const std::chrono::duration<double> elapsed = std::chrono::steady_clock::now() - begin;
  if (status != 0) {
    throw std::runtime_error(command.front() + " has failed");
  }
  return elapsed.count();
}

/// The time of `command` less that of `start`, which starts the same program and does no work.
double Beyond(const Command& start, const Command& command) {
  constexpr int STARTS = 5;
  /// A shorter time cannot be distinguished from the start.
  constexpr double SHORTEST = 0.0001;
  Times starts;
  for (int i = 0; i < STARTS; ++i) {
    starts.push_back(RunTime(start));
  }
  return std::max(RunTime(command) - Median(starts), SHORTEST);
}

/// A parameter of a script and its value, an SQL expression.
struct Parameter {
  std::string name;
  std::string value;
};

/// The shell's command that sets a parameter.
std::string Setting(const Parameter& parameter) {
  return ".parameter set " + parameter.name + " " + parameter.value;
}

/// A text as an argument of the shell's command.
std::string SqlText(const std::string& text) {
  return "\"'" + text + "'\"";
}

/// The sqlite3 shell that runs a script on a database.
Command Script(const std::string& script, const std::string& database,
               const std::vector<Parameter>& parameters) {
  Command command{SHELL, "-bail"};
  for (const Parameter& parameter : parameters) {
    command.insert(command.end(), {"-cmd", Setting(parameter)});
  }
  command.insert(command.end(), {database, ".read " + script});
  return command;
}

void RemoveDatabase(const std::string& path) {
  std::filesystem::remove(path);
  std::filesystem::remove(path + "-journal");
}

} // namespace

double MergeByFloor(const std::string& catalog, const std::string& merged,
                    const std::string& volume) {
  RemoveDatabase(merged);
  return Beyond({FLOOR}, {FLOOR, SCHEMA, catalog, merged, volume});
}

double MergeByHorizon(const std::string& catalog, const std::string& merged,
                      const std::string& volume) {
  RemoveDatabase(merged);
  return Beyond(
      SHELL_START,
      Script(MERGE_SCRIPT, merged, {{":catalog", SqlText(catalog)}, {":volume", SqlText(volume)}}));
}

double AddByHorizon(const std::string& catalog, const std::string& merged,
                    const std::string& volume, std::time_t since) {
  return Beyond(SHELL_START, Script(ADD_SCRIPT, merged,
                                    {{":catalog", SqlText(catalog)},
                                     {":volume", SqlText(volume)},
                                     {":since", std::to_string(since)}}));
}

double StepReaderStatements(const std::string& catalog, std::time_t since) {
  std::ofstream(READER_SCRIPT) << SELECT_FOLDERS << ";\n"
                               << Setting({"?1", std::to_string(since)}) << '\n'
                               << SELECT_CHANGED_FILES << ";\n"
                               << Setting({"?1", std::to_string(RENDERED_STATUS)}) << '\n'
                               << COUNT_RENDERED << ";\n"
                               << COUNT_PHOTOS << ";\n";
  return Beyond(SHELL_START, {SHELL, "-bail", "-readonly", catalog, ".read " + READER_SCRIPT});
}

void ListFileIds(const std::string& merged, const std::string& ids) {
  RemoveDatabase(ids);
  RunTime(Script(IDS_SCRIPT, ids, {{":merged", SqlText(merged)}}));
}

double DeleteByShell(const std::string& merged, const std::string& ids) {
  return Beyond(SHELL_START, Script(DELETE_SCRIPT, merged, {{":ids", SqlText(ids)}}));
}

} // namespace orva::bench
