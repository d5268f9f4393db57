#include "DaemonLayerTest.h"

#include <sys/stat.h>

#include <cerrno>
#include <system_error>

namespace orva::test {

Log DaemonLayerTest::Logged() {
  Log lines = LoggedByAllThreads();
  std::erase_if(lines, [](const LogLine& line) {
    return line.text.starts_with("Iterating over mount point ");
  });
  return lines;
}

Log DaemonLayerTest::LoggedByAllThreads() {
  Log lines = log_.Lines(taken_);
  taken_ += lines.size();
  for (LogLine& line : lines) {
    line.text = MaskTimes(line.text);
  }
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

std::string MergedDatabasePath(const std::string& location) {
  return location + "/.zophotos/zophotos.db";
}

Lines MergedRows(const std::string& location, const std::string& sql) {
  return MergedDatabase(location).Rows().Run(sql);
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
  return MergedDatabase(location).Statistics();
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

} // namespace orva::test
