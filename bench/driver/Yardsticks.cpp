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

const std::string SHELL = "sqlite3";
const std::vector<std::string> SHELL_START{SHELL, ":memory:", ".read /dev/null"};
const std::string SCHEMA = "bench/schema.sql";
const std::string HORIZON_SCRIPT = "bench/horizon/merge.sql";
const std::string READER_SCRIPT = "/tmp/reader.sql";

/// The floor's output: a file in memory, as the daemon's.
const std::string LINES = "/tmp/floor.out";
const std::string NOWHERE = "/dev/null";

/// The seconds from before the start of a program to after its end, with its standard output in the
/// file `output`. Throws std::runtime_error unless it ends with status 0.
double RunTime(const std::vector<std::string>& command, const std::string& output) {
  constexpr std::chrono::hours LIMIT{24};
  const auto begin = std::chrono::steady_clock::now();
  test::Program program(command, {.output = output, .errors = test::Program::Errors::Inherited});
  const int status = program.WaitForEnd(LIMIT);
  const std::chrono::duration<double> elapsed = std::chrono::steady_clock::now() - begin;
  if (status != 0) {
    throw std::runtime_error(command.front() + " has failed");
  }
  return elapsed.count();
}

/// The time of `command` less that of `start`, which starts the same program and does no work.
double Beyond(const std::vector<std::string>& start, const std::vector<std::string>& command,
              const std::string& output) {
  constexpr int STARTS = 5;
  /// A shorter time cannot be distinguished from the start.
  constexpr double SHORTEST = 0.0001;
  Times starts;
  for (int i = 0; i < STARTS; ++i) {
    starts.push_back(RunTime(start, NOWHERE));
  }
  return std::max(RunTime(command, output) - Median(starts), SHORTEST);
}

/// The shell's command that sets a parameter to `value`, an SQL expression.
std::string Parameter(const std::string& name, const std::string& value) {
  return ".parameter set " + name + " " + value;
}

std::string SqlText(const std::string& text) {
  return "\"'" + text + "'\"";
}

void RemoveDatabase(const std::string& path) {
  std::filesystem::remove(path);
  std::filesystem::remove(path + "-journal");
}

} // namespace

double MergeByFloor(const std::string& catalog, const std::string& merged,
                    const std::string& volume) {
  RemoveDatabase(merged);
  return Beyond({FLOOR}, {FLOOR, SCHEMA, catalog, merged, volume}, LINES);
}

double MergeByHorizon(const std::string& catalog, const std::string& merged,
                      const std::string& volume) {
  RemoveDatabase(merged);
  return Beyond(SHELL_START,
                {SHELL, "-bail", "-cmd", Parameter(":catalog", SqlText(catalog)), "-cmd",
                 Parameter(":volume", SqlText(volume)), merged, ".read " + HORIZON_SCRIPT},
                NOWHERE);
}

double StepReaderStatements(const std::string& catalog, std::time_t since) {
  std::ofstream(READER_SCRIPT) << SELECT_FOLDERS << ";\n"
                               << Parameter("?1", std::to_string(since)) << '\n'
                               << SELECT_CHANGED_FILES << ";\n"
                               << Parameter("?1", std::to_string(RENDERED_STATUS)) << '\n'
                               << COUNT_RENDERED << ";\n"
                               << COUNT_PHOTOS << ";\n";
  return Beyond(SHELL_START, {SHELL, "-bail", "-readonly", catalog, ".read " + READER_SCRIPT},
                NOWHERE);
}

} // namespace orva::bench
