#include "DaemonLayerTest.h"

#include "Database.h"

#include <sys/stat.h>
#include <syslog.h>

#include <fstream>
#include <iterator>
#include <regex>
#include <stdexcept>

namespace orva::test {

namespace {

const std::string MERGER_THREAD_LINE = "Iterating over mount point ";

std::string MaskTimes(const std::string& text) {
  static const std::regex time(R"(\d+\.\d{3} W   \d+\.\d{3} U   \d+\.\d{3} S   \d+\.\d%)");
  return std::regex_replace(text, time, "TIME");
}

} // namespace

Log DaemonLayerTest::Logged() {
  Log lines = LoggedByAllThreads();
  std::erase_if(lines,
                [](const LogLine& line) { return line.text.starts_with(MERGER_THREAD_LINE); });
  return lines;
}

Log DaemonLayerTest::LoggedByAllThreads() {
  // Messages arrive in order: when this one is there, all that was logged before is.
  const LogLine mark = Info("mark " + std::to_string(++marks_));
  syslog(mark.priority, "%s", mark.text.c_str());
  if (!log_.Await(mark)) {
    throw std::runtime_error("the system log does not answer");
  }
  const Log all = log_.Lines();
  Log lines;
  for (; all[taken_] != mark; ++taken_) {
    lines.push_back({all[taken_].priority, MaskTimes(all[taken_].text)});
  }
  ++taken_;
  return lines;
}

std::string MakeDirectory(const std::string& path) {
  std::filesystem::create_directories(path);
  return path;
}

unsigned ModeOf(const std::string& path) {
  struct stat status {};
  if (lstat(path.c_str(), &status) != 0) {
    throw std::system_error(errno, std::generic_category(), path);
  }
  return status.st_mode & 07777U;
}

dbmerger::VolumeInfo Record(const std::string& mountPoint, double capacity, double free,
                            bool readOnly) {
  return {.mountPoint = mountPoint,
          .capacity = capacity,
          .used = capacity - free,
          .photoDbSize = 1,
          .readOnly = readOnly};
}

std::string Locator() {
  std::ifstream file("/tmp/zophotodbmerger.conf", std::ios::binary);
  if (!file) {
    return "(absent)";
  }
  return {std::istreambuf_iterator<char>(file), {}};
}

std::string MergedDatabasePath(const std::string& location) {
  return location + "/.zophotos/zophotos.db";
}

Lines MergedRows(const std::string& location, const std::string& sql) {
  return Database(MergedDatabasePath(location)).Run(sql);
}

Lines MergedFolders(const std::string& location) {
  return MergedRows(location,
                    "SELECT name, volume FROM Folders WHERE folder_id != 1 ORDER BY name");
}

Lines MergedFiles(const std::string& location) {
  return MergedRows(location, "SELECT coalesce(o.name, 'no folder: ') || f.name FROM Files f LEFT "
                              "JOIN Folders o ON o.folder_id = f.folder_id ORDER BY 1");
}

Lines MergedStatistics(const std::string& location) {
  return MergedRows(location, "SELECT volume, photos_xcoded, photos_total, last_updated_time FROM "
                              "Statistics ORDER BY volume");
}

Lines MergedContent(const std::string& location) {
  Lines content;
  for (const char* const table : {"Status", "Statistics", "Folders", "Files", "sqlite_sequence"}) {
    content.emplace_back(table);
    for (const std::string& row :
         MergedRows(location, std::string("SELECT * FROM ") + table + " ORDER BY rowid")) {
      content.push_back(row);
    }
  }
  return content;
}

Log MergeLines(const std::string& mountPoint, int folders, int files) {
  const std::string place = mountPoint + " in TIME\n";
  return {Info("Retrieved changed folders list for " + place),
          Info("Retrieved " + std::to_string(files) + " changed files list for " + place),
          Info("Retrieved counts from the orva db for mountPoint " + place),
          Info("Merged " + std::to_string(folders) + " folders for " + place),
          Info("Merged " + std::to_string(files) + " files for " + place)};
}

Log Joined(Log first, const Log& second) {
  first.insert(first.end(), second.begin(), second.end());
  return first;
}

} // namespace orva::test
