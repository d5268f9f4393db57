#include "stdafx.h"

#include "SetMerge.h"

#include "FileSet.h"
#include "FolderSet.h"
#include "MergeList.h"
#include "PhotoDB.h"
#include "StandardOutput.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"

#include <algorithm>

namespace orva::dbmerger {

namespace {

/// What the operations on single rows read.
template <typename Item>
Item MakeItem(const MergeItem& row) {
  Item item;
  item.path = row.Path();
  item.name = row.Name();
  item.lastModifiedDate = row.modified;
  return item;
}

} // namespace

SetMerge::SetMerge(const PhotoDB& photos, const std::string& volume,
                   const std::atomic<bool>& stopRequested)
    : photos_(photos), volume_(volume), stopRequested_(stopRequested),
      inSets_(photos.HasOwnSchema()) {}

void SetMerge::ApplyFolders(const MergeList& folders) const {
  if (inSets_) {
    FolderSet(photos_, volume_, stopRequested_).Apply(folders.Items());
  } else {
    ApplySingleFolders(folders);
  }
}

std::time_t SetMerge::ApplyFiles(const MergeList& files, std::time_t since) const {
  return inSets_ ? FileSet(photos_, volume_, stopRequested_).Apply(files.Items(), since)
                 : ApplySingleFiles(files, since);
}

void SetMerge::ApplySingleFolders(const MergeList& folders) const {
  for (const MergeItem& row : folders.Items()) {
    if (stopRequested_) {
      return;
    }
    auto folder = MakeItem<db::Folder>(row);
    if (row.isDeleted) {
      photos_.DeleteFolder(volume_, folder);
    } else {
      photos_.AddFolder(volume_, folder);
    }
  }
}

std::time_t SetMerge::ApplySingleFiles(const MergeList& files, std::time_t since) const {
  StandardOutput& output = StandardOutput::Current();
  const FlushAtEnd flush(output);
  std::time_t newest = since;
  for (const MergeItem& row : files.Items()) {
    if (stopRequested_) {
      break;
    }
    output.WriteLine({"Processing file ", row.Path(), " isdeleted=", row.isDeleted ? "1" : "0",
                      " status = ", std::to_string(row.status)});
    if (row.isSystem) {
      continue;
    }
    auto file = MakeItem<db::File>(row);
    output.WriteLine(
        {row.isDeleted ? "Removing file " : "Adding file ", row.Path(), " for mount ", volume_});
    output.Flush();
    if (row.isDeleted) {
      photos_.DeleteFile(volume_, file);
    } else {
      photos_.AddFile(volume_, file);
    }
    newest = std::max<std::time_t>(newest, row.updated);
  }
  return newest;
}

} // namespace orva::dbmerger
