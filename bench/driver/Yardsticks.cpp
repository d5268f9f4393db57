#include "Yardsticks.h"

#include "Median.h"
#include "Process.h"
#include "ReaderStatements.h"

#include <filesystem>
#include <fstream>

namespace orva::bench {

namespace {

const std::string SHELL = "sqlite3";
const std::string SCHEMA = "bench/schema.sql";
const std::string HORIZON_SCRIPT = "bench/horizon/merge.sql";
const std::string READER_SCRIPT = "/tmp/reader.sql";

/// Where the floor's lines go: a file in memory, as the daemon's.
const std::string LINES = "/tmp/floor.out";
const std::string NOWHERE = "/dev/null";

template <typename Start>
double MedianOfStarts(Start start) {
  constexpr int STARTS = 15;
  Times times;
  for (int i = 0; i < STARTS; ++i) {
    times.push_back(start());
  }
  return Median(times);
}

/// A value for the shell's parameters, as SQL.
std::string Parameter(const std::string& name, const std::string& value) {
  return ".parameter set " + name + " " + value;
}

std::string Quoted(const std::string& text) {
  return "\"'" + text + "'\"";
}

void RemoveDatabase(const std::string& path) {
  std::filesystem::remove(path);
  std::filesystem::remove(path + "-journal");
}

} // namespace

Yardsticks::Yardsticks()
    : floorStart_(MedianOfStarts([] { return RunProcess({FLOOR}, LINES); })),
      shellStart_(MedianOfStarts([] {
        return RunProcess({SHELL, ":memory:", ".read /dev/null"}, NOWHERE);
      })) {}

double Yardsticks::Floor(const std::string& catalog, const std::string& merged,
                         const std::string& volume) const {
  RemoveDatabase(merged);
  return RunProcess({FLOOR, SCHEMA, catalog, merged, volume}, LINES) - floorStart_;
}

double Yardsticks::Horizon(const std::string& catalog, const std::string& merged,
                           const std::string& volume) const {
  RemoveDatabase(merged);
  return RunProcess({SHELL, "-bail", "-cmd", Parameter(":catalog", Quoted(catalog)), "-cmd",
                     Parameter(":volume", Quoted(volume)), merged, ".read " + HORIZON_SCRIPT},
                    NOWHERE) -
         shellStart_;
}

double Yardsticks::ReaderStatements(const std::string& catalog, std::time_t since) const {
  std::ofstream(READER_SCRIPT) << SELECT_FOLDERS << ";\n"
                               << Parameter("?1", std::to_string(since)) << '\n'
                               << SELECT_CHANGED_FILES << ";\n"
                               << Parameter("?1", std::to_string(RENDERED_STATUS)) << '\n'
                               << COUNT_RENDERED << ";\n"
                               << COUNT_PHOTOS << ";\n";
  return RunProcess({SHELL, "-bail", "-readonly", catalog, ".read " + READER_SCRIPT}, NOWHERE) -
         shellStart_;
}

} // namespace orva::bench
