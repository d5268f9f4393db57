#include "stdafx.h"

#include "Comparison.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"

namespace orva::dbmerger {

namespace {

std::unique_ptr<Folder> NewFolder(const db::Folder& folder, const FolderDiffProcessor& result) {
  return std::make_unique<Folder>(Folder{.folder_id = -1,
                                         .parent_folder_id = result.parent,
                                         .name = folder.path,
                                         .folder_name = folder.name,
                                         .modified_date = folder.lastModifiedDate,
                                         .volume = result.volume});
}

std::unique_ptr<File> NewFile(const db::File& file, const FileDiffProcessor& result) {
  return std::make_unique<File>(File{.file_id = -1,
                                     .folder_id = result.parent,
                                     .name = file.name,
                                     .modified_date = file.lastModifiedDate,
                                     .volume = result.volume,
                                     .created_date = file.lastModifiedDate});
}

/// Walks two sorted lists side by side: `onlyMerged` and `onlyCatalog` are called for the entries
/// that one list has, `both` with the merged entry of a pair.
template <typename Merged, typename Catalog, typename OnlyMerged, typename OnlyCatalog,
          typename Both>
void Walk(const std::vector<Merged*>& merged, std::string Merged::*key,
          const std::vector<Catalog*>& catalog, OnlyMerged onlyMerged, OnlyCatalog onlyCatalog,
          Both both) {
  auto m = merged.begin();
  auto c = catalog.begin();
  while (m != merged.end() && c != catalog.end()) {
    const int order = ((*m)->*key).compare((*c)->name);
    if (order < 0) {
      onlyMerged(**m++);
    } else if (order > 0) {
      onlyCatalog(**c++);
    } else {
      both(**m++);
      ++c;
    }
  }
  for (; m != merged.end(); ++m) {
    onlyMerged(**m);
  }
  for (; c != catalog.end(); ++c) {
    onlyCatalog(**c);
  }
}

} // namespace

void DiffFolder(const std::vector<Folder*>& merged, const std::vector<db::Folder*>& catalog,
                FolderDiffProcessor& result) {
  Walk(
      merged, &Folder::folder_name, catalog,
      [&](const Folder& folder) { result.removed.push_back(std::make_unique<Folder>(folder)); },
      [&](const db::Folder& folder) { result.added.push_back(NewFolder(folder, result)); },
      [&](const Folder& folder) { result.common.push_back(std::make_unique<Folder>(folder)); });
}

void DiffFile(const std::vector<File*>& merged, const std::vector<db::File*>& catalog,
              FileDiffProcessor& result) {
  Walk(
      merged, &File::name, catalog,
      [&](const File& file) { result.removed.push_back(std::make_unique<File>(file)); },
      [&](const db::File& file) { result.added.push_back(NewFile(file, result)); },
      [](const File&) {});
}

} // namespace orva::dbmerger
