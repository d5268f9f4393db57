#pragma once

#include "Catalog.h"

#include "Random.h"

#include <memory>
#include <string>

namespace orva::test {

/// A volume that keeps what it holds while it is not plugged in: a tmpfs below /tmp/disks that is
/// shown below /shares. Its catalog can be changed at any time, as if the disk had been elsewhere.
class Disk {
public:
  /// Makes the disk with an empty catalog, not yet mounted. `size` as mount takes it ("150g").
  Disk(std::string name, const std::string& size);
  Disk(const Disk&) = delete;
  Disk& operator=(const Disk&) = delete;
  ~Disk();

  /// The place that a service names, without a trailing separator; there only while mounted.
  std::string Path() const { return "/shares/" + name_; }
  /// The place as the daemon registers it.
  std::string MountPoint() const { return Path() + "/"; }
  /// Where the same files are always to be found.
  std::string Keeper() const { return "/tmp/disks/" + name_; }

  void Mount();
  bool IsMounted() const { return mounted_; }

  /// Takes the file system away; its mount point stays behind, until Sweep.
  void Unmount();
  /// Removes the mount point that Unmount has left, with what somebody put there since.
  void Sweep() const;

  /// Lets nobody, or everybody, write below Path. A disk that is mounted again is writable.
  void SetReadOnly(bool readOnly);
  bool IsReadOnly() const { return readOnly_; }

  /// What there is of a catalog.
  enum class CatalogState {
    Good,
    Absent, ///< cannot be opened
    Broken, ///< can be opened and not be read
  };
  CatalogState State() const { return state_; }
  /// Takes the catalog away, breaks it in one of several ways, or puts it back.
  void SetCatalogState(CatalogState state, Random& random);

  /// The catalog. Only read while it is not good.
  const Database& Rows() const { return catalog_->Rows(); }

  /// Makes one change of a good catalog as an indexer would, or should not; returns what it was.
  std::string Change(Random& random);

private:
  std::string AddFolder(Random& random);
  std::string AddPhotos(Random& random);
  std::string ChangePhoto(Random& random);
  std::string ChangeFolder(Random& random);
  void Rename(const std::string& folder);

  std::string NewName();
  std::string AnyFolder(Random& random) const;
  std::string AnyPhoto(Random& random) const;
  std::string Stamp(Random& random);
  bool IsFull() const;

  std::string name_;
  std::string catalogPath_;
  std::unique_ptr<Catalog> catalog_;
  CatalogState state_ = CatalogState::Good;
  bool mounted_ = false;
  bool readOnly_ = false;
  bool withoutTable_ = false; ///< how the catalog was broken
  long names_ = 0;
  long stamp_ = 1000;
};

} // namespace orva::test
