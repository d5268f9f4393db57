#include "Content.h"

#include "Appliance.h"

#include <algorithm>
#include <sstream>

namespace orva::test {

namespace {

using Fields = std::vector<std::string>;

const std::string NOTHING = "nothing";

Fields Split(const std::string& row) {
  Fields fields;
  std::istringstream stream(row);
  for (std::string field; std::getline(stream, field, '|');) {
    fields.push_back(field);
  }
  return fields;
}

/// The path of the folder of `path`.
std::string ParentOf(const std::string& path) {
  return path.substr(0, path.rfind('/', path.size() - 2) + 1);
}

std::string Count(const Disk& disk, const std::string& condition) {
  return disk.Rows()
      .Run("SELECT count(*) FROM Files WHERE category = 3 AND NOT isSystem AND NOT isBackup AND "
           "NOT isHidden AND NOT isDeleted AND " +
           condition)
      .at(0);
}

} // namespace

Content::Content() {
  folders_["/shares/"] = {.parent = "-1", .modified = "0", .volume = "<DUMMY>"};
}

Content Content::At(const std::string& location) {
  Content content;
  if (!HasMergedDatabase(location)) {
    return content;
  }
  const MergedDatabase database(location);
  content.folders_.clear();
  for (const std::string& row : database.Folders()) {
    const Fields fields = Split(row);
    const bool known = fields.at(1).starts_with("/") || fields.at(1) == "-1";
    content.folders_[fields.at(0)] = {
        .parent = known ? fields.at(1) : NOTHING, .modified = fields.at(2), .volume = fields.at(3)};
  }
  for (const std::string& row : database.Files()) {
    const Fields fields = Split(row);
    content.files_[fields.at(0)] = {
        .modified = fields.at(1), .created = fields.at(2), .volume = fields.at(3)};
  }
  for (const std::string& row : database.Statistics()) {
    const Fields fields = Split(row);
    content.statistics_[fields.at(0)] = {
        .transcoded = fields.at(1), .total = fields.at(2), .updated = std::stol(fields.at(3))};
  }
  return content;
}

void Content::Merge(const Disk& disk) {
  Statistics& statistics = statistics_[disk.MountPoint()];
  ApplyFolders(disk);
  statistics.updated = ApplyFiles(disk, statistics.updated);
  statistics.transcoded = Count(disk, "status = 3");
  statistics.total = Count(disk, "1");
}

void Content::ApplyFolders(const Disk& disk) {
  AddFolder(disk.MountPoint(), "0", disk.MountPoint());
  for (const std::string& row :
       disk.Rows().Run("SELECT path, lastModifiedDate, isDeleted FROM Folders WHERE NOT isSystem "
                       "AND NOT isBackup AND NOT isHidden ORDER BY path")) {
    const Fields fields = Split(row);
    const std::string path = disk.MountPoint() + fields.at(0);
    if (fields.at(2) == "1") {
      DeleteFolder(path, disk.MountPoint());
    } else {
      AddFolder(path, fields.at(1), disk.MountPoint());
    }
  }
}

void Content::AddFolder(const std::string& path, const std::string& modified,
                        const std::string& volume) {
  const std::string parent = ParentOf(path);
  if (folders_.contains(parent)) {
    folders_.insert({path, {.parent = parent, .modified = modified, .volume = volume}});
  }
}

/// Subfolders stay until the catalog marks them as deleted, too.
void Content::DeleteFolder(const std::string& path, const std::string& volume) {
  const auto found = folders_.find(path);
  if (found == folders_.end() || found->second.volume != volume) {
    return;
  }
  folders_.erase(found);
  std::erase_if(files_, [&](const auto& file) { return ParentOf(file.first) == path; });
  for (auto& [name, folder] : folders_) {
    folder.parent = folder.parent == path ? NOTHING : folder.parent;
  }
}

long Content::ApplyFiles(const Disk& disk, long since) {
  long newest = since;
  for (const std::string& row :
       disk.Rows().Run("SELECT f.path, f.lastModifiedDate, f.isDeleted, t.lastUpdatedDate "
                       "FROM Files f JOIN Transcodings t ON t.sourceId = f.id "
                       "WHERE t.profile = 'cb62bbdd389b48898f2e5244977cb2c5' AND NOT f.isSystem "
                       "AND t.lastUpdatedDate > CAST(? AS INTEGER) AND t.status = 1 - f.isDeleted "
                       "ORDER BY f.path",
                       {std::to_string(since)})) {
    const Fields fields = Split(row);
    const std::string path = disk.MountPoint() + fields.at(0);
    newest = std::max(newest, std::stol(fields.at(3)));
    const auto folder = folders_.find(ParentOf(path));
    if (folder == folders_.end()) {
      continue;
    }
    if (fields.at(2) == "1") {
      files_.erase(path);
    } else if (folder->second.volume == disk.MountPoint()) {
      files_.insert(
          {path, {.modified = fields.at(1), .created = fields.at(1), .volume = disk.MountPoint()}});
    }
  }
  return newest;
}

void Content::RemoveVolume(const std::string& mountPoint) {
  std::erase_if(folders_, [&](const auto& folder) { return folder.second.volume == mountPoint; });
  std::erase_if(files_, [&](const auto& file) { return file.second.volume == mountPoint; });
  const auto statistics = statistics_.find(mountPoint);
  if (statistics != statistics_.end()) {
    statistics->second.updated = 0;
  }
}

std::vector<std::string> Content::Lines(const std::vector<std::string>& of) const {
  const auto isWanted = [&](const std::string& volume) {
    return of.empty() || std::find(of.begin(), of.end(), volume) != of.end();
  };
  std::vector<std::string> lines;
  for (const auto& [path, folder] : folders_) {
    if (isWanted(folder.volume)) {
      lines.push_back("folder " + path + " below " + folder.parent + " of " + folder.modified +
                      " on " + folder.volume);
    }
  }
  for (const auto& [path, file] : files_) {
    if (isWanted(file.volume)) {
      lines.push_back("file " + path + " of " + file.modified + " and " + file.created + " on " +
                      file.volume);
    }
  }
  for (const auto& [volume, statistics] : statistics_) {
    if (isWanted(volume)) {
      lines.push_back("statistics of " + volume + ": " + statistics.transcoded + " of " +
                      statistics.total + " until " + std::to_string(statistics.updated));
    }
  }
  std::sort(lines.begin(), lines.end());
  return lines;
}

} // namespace orva::test
