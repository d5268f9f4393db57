#include "Model.h"

#include "Appliance.h"

#include <sys/statvfs.h>

#include <algorithm>
#include <filesystem>
#include <ostream>

namespace orva::test {
namespace {

using notify::Event;

const std::string SHARES = "/shares";
constexpr double SHARES_CAPACITY = 104857600000.0;
constexpr double NEEDED_SPACE = 209715200.0;

/// The daemon gives up a merge; the notification is handled.
struct GivenUp {};
/// The daemon gives up the notification.
struct Refused {};

} // namespace

std::ostream& operator<<(std::ostream& stream, const Result& result) {
  return stream << "merge into '" << result.mergedInto << "', done " << result.merges
                << ", given up " << result.gaveUp << ", refused " << result.refused;
}

Result Model::Handle(Event event, const std::string& mountPoint, Contents& databases,
                     Circumstances circumstances) {
  databases_ = &databases;
  circumstances_ = circumstances;
  result_ = {};
  const bool unfinished = IsUnfinished();
  if (event == Event::Unplugged) {
    Unregister(mountPoint);
  } else {
    Register(event, mountPoint);
  }
  try {
    if (unfinished) {
      Move();
    }
    Dispatch(event, mountPoint);
  } catch (const Refused&) {
    result_.refused = true;
    if (IsUnfinished() && !stopped_) {
      MoveAfterFailure();
    }
  }
  return result_;
}

bool Model::IsUnfinished() const {
  return state_ == State::Scanned && (stopped_ || master_.empty());
}

void Model::Register(Event event, const std::string& mountPoint) {
  if (!std::filesystem::exists(mountPoint) ||
      std::any_of(volumes_.begin(), volumes_.end(),
                  [&](const Record& record) { return record.mountPoint == mountPoint; })) {
    return;
  }
  Record record{.mountPoint = mountPoint, .capacity = 1, .free = 0};
  struct statvfs facts {};
  if (event == Event::Plugged && statvfs(mountPoint.c_str(), &facts) == 0) {
    record.capacity = static_cast<double>(facts.f_blocks * facts.f_frsize);
    record.free = static_cast<double>(facts.f_bfree * facts.f_bsize);
  }
  volumes_.push_back(record);
}

void Model::Unregister(const std::string& mountPoint) {
  if (master_ == mountPoint) {
    master_.clear();
  }
  std::erase_if(volumes_, [&](const Record& record) { return record.mountPoint == mountPoint; });
}

bool Model::Elect() {
  if (!master_.empty()) {
    return true;
  }
  const Record* best = nullptr;
  for (const Record& record : volumes_) {
    if (record.free > NEEDED_SPACE && (best == nullptr || record.capacity > best->capacity)) {
      best = &record;
    }
  }
  if (best != nullptr) {
    master_ = best->mountPoint;
  }
  return best != nullptr;
}

bool Model::KeepsTheSharesRootOut(const std::string& mountPoint) const {
  bool registered = false;
  for (const Record& record : volumes_) {
    if (record.mountPoint != mountPoint && record.capacity > SHARES_CAPACITY) {
      return false;
    }
    registered = registered || record.mountPoint == SHARES;
  }
  return registered;
}

void Model::Dispatch(Event event, const std::string& mountPoint) {
  const bool isWork =
      event == Event::Scanned || event == Event::TranscodedBatch || event == Event::End;
  if (event == Event::Unplugged) {
    Unplugged(mountPoint);
  } else if (state_ == State::Default && event == Event::Plugged) {
    state_ = Elect() ? State::Plugged : State::Default;
  } else if (state_ != State::Scanned && isWork && Elect()) {
    EnterScanned();
  } else if (state_ == State::Scanned && isWork && event != Event::Scanned) {
    Merge(mountPoint);
  } else if (state_ == State::Scanned && event == Event::Purged) {
    result_.mergedInto = master_;
    RemoveVolume(mountPoint);
    Merge(mountPoint);
  }
}

void Model::Unplugged(const std::string& mountPoint) {
  if (state_ == State::Default) {
    return;
  }
  if (state_ == State::Scanned) {
    RemoveVolume(mountPoint);
  }
  Move();
}

void Model::Move() {
  stopped_ = state_ == State::Scanned;
  if (Elect()) {
    EnterScanned();
  } else {
    FallBack();
  }
}

void Model::MoveAfterFailure() {
  try {
    Move();
  } catch (const Refused&) {
    // The next event repeats it.
  }
}

void Model::EnterScanned() {
  Open(Location(master_));
  locator_ = "zophotos_db_path=" + master_ + "/.zophotos/zophotos.db\n";
  stopped_ = false;
  state_ = State::Scanned;
}

void Model::FallBack() {
  DatabaseOf(SHARES) = Content();
  locator_ = "zophotos_db_path=/shares//.zophotos/zophotos.db\n";
  stopped_ = false;
  if (std::filesystem::exists(SHARES)) {
    volumes_.push_back(
        {.mountPoint = SHARES, .capacity = SHARES_CAPACITY, .free = SHARES_CAPACITY});
  }
  state_ = State::Default;
}

void Model::Merge(const std::string& mountPoint) {
  result_.mergedInto = master_;
  try {
    const auto disk = disks_.find(mountPoint);
    if (disk == disks_.end() || !HasCatalog(*disk->second)) {
      throw GivenUp();
    }
    try {
      Open(Location(master_));
    } catch (const Refused&) {
      // Without the directory the database has not failed.
      if (std::filesystem::exists(Location(master_) + "/.zophotos")) {
        throw GivenUp();
      }
      throw;
    }
    if (disk->second->State() == Disk::CatalogState::Broken || circumstances_.mergeLocked ||
        !IsWritable(Location(master_))) {
      throw GivenUp();
    }
    DatabaseOf(master_).Merge(*disk->second);
    result_.merges = 1;
  } catch (const GivenUp&) {
    result_.gaveUp = true;
  }
}

bool Model::HasCatalog(const Disk& disk) const {
  return circumstances_.readable.value_or(disk.IsMounted() &&
                                          disk.State() != Disk::CatalogState::Absent);
}

void Model::RemoveVolume(const std::string& mountPoint) {
  Open(Location(master_));
  if (circumstances_.removalLocked || !IsWritable(Location(master_))) {
    throw Refused();
  }
  DatabaseOf(master_).RemoveVolume(mountPoint);
}

void Model::Open(const std::string& location) const {
  if (!IsWritable(location) && !HasMergedDatabase(location)) {
    throw Refused();
  }
}

std::string Model::Location(const std::string& mountPoint) const {
  const auto disk = disks_.find(mountPoint);
  if (disk != disks_.end() && disk->second->IsMounted()) {
    return disk->second->Keeper();
  }
  return mountPoint == SHARES && std::filesystem::exists(SHARES) ? SHARES : NO_PLACE;
}

bool Model::IsWritable(const std::string& location) const {
  return std::none_of(disks_.begin(), disks_.end(), [&](const auto& disk) {
    return disk.second->Keeper() == location && disk.second->IsReadOnly();
  });
}

Content& Model::DatabaseOf(const std::string& mountPoint) {
  return (*databases_)[Location(mountPoint)];
}

} // namespace orva::test
