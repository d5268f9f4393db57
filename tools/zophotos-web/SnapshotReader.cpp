#include "SnapshotReader.h"

namespace orva::web {

class SnapshotReader::Implementation {};

SnapshotReader::SnapshotReader(const Snapshot& /*snapshot*/) {}

SnapshotReader::~SnapshotReader() = default;

std::vector<Photo> SnapshotReader::Photos(const Filter& /*filter*/,
                                          std::optional<PhotoId> /*before*/,
                                          std::size_t /*count*/) {
  return {};
}

std::vector<Photo> SnapshotReader::PhotosAfter(const Filter& /*filter*/, PhotoId /*after*/,
                                               std::size_t /*count*/) {
  return {};
}

std::optional<Photo> SnapshotReader::Find(PhotoId /*id*/) {
  return std::nullopt;
}

std::vector<Folder> SnapshotReader::Folders(std::int64_t /*parent*/,
                                            const std::string& /*afterPath*/,
                                            std::size_t /*count*/) {
  return {};
}

std::optional<Folder> SnapshotReader::FindFolder(std::int64_t /*id*/) {
  return std::nullopt;
}

std::vector<Folder> SnapshotReader::Ancestors(std::int64_t /*folder*/) {
  return {};
}

std::vector<VolumeRow> SnapshotReader::Volumes() {
  return {};
}

std::vector<Month> SnapshotReader::Months(const Filter& /*filter*/) {
  return {};
}

std::int64_t SnapshotReader::Version() {
  return 0;
}

} // namespace orva::web
