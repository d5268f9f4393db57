#include "Snapshot.h"

#include <utility>

namespace orva::web {

class Snapshot::Implementation {
public:
  Implementation(std::string directory, FindPath findPath)
      : directory_(std::move(directory)), findPath_(std::move(findPath)) {}

  std::string directory_;
  FindPath findPath_;
};

Snapshot::Snapshot(std::string directory, FindPath findPath)
    : implementation_(std::make_unique<Implementation>(std::move(directory), std::move(findPath))) {
}

Snapshot::~Snapshot() = default;

bool Snapshot::Update(const std::stop_token& /*stop*/) {
  return false;
}

void Snapshot::Close() {}

SnapshotStatus Snapshot::Status() const {
  return {};
}

std::string Snapshot::File() const {
  return implementation_->directory_;
}

} // namespace orva::web
