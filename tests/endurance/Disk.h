#pragma once

#include "Catalog.h"

#include "Random.h"

#include <memory>
#include <string>

namespace orva::test {

/// A volume that keeps its content while it is not plugged in: a tmpfs below /tmp/disks, with a
/// bind mount below /shares. Its catalog can be changed at any time, as if another machine had done
/// it.
class Disk {
public:
  /// Creates the disk with an empty catalog, not yet mounted. `size` as in mount(8) ("150g").
  Disk(std::string name, const std::string& size);
  Disk(const Disk&) = delete;
  Disk& operator=(const Disk&) = delete;
  ~Disk();

  /// The mount point as the notification service writes it, without a trailing separator.
  std::string Path() const { return "/shares/" + name_; }
  /// The mount point as the daemon registers it.
  std::string MountPoint() const { return Path() + "/"; }
  /// The place where its files can always be found.
  std::string Keeper() const { return "/tmp/disks/" + name_; }

  void Mount();
  bool IsMounted() const { return mounted_; }

  /// Unmounts the disk; the directory of the mount point stays until Sweep.
  void Unmount();
  /// Removes the directory that Unmount has left, with its content.
  void Sweep() const;

  /// Makes the mount at Path read-only or writable. Mount makes it writable again.
  void SetReadOnly(bool readOnly);
  bool IsReadOnly() const { return readOnly_; }

  /// The state of the catalog file.
  enum class CatalogState {
    Good,
    Absent, ///< cannot be opened
    Broken, ///< can be opened, but not be read
  };
  CatalogState State() const { return state_; }
  /// Removes the catalog, breaks it in one of several ways, or restores it.
  void SetCatalogState(CatalogState state, Random& random);

  /// The catalog. Must not be written unless its state is Good.
  const Database& Rows() const { return catalog_->Rows(); }

  /// Makes a random change in a good catalog, also ones that no indexer should make. Returns its
  /// description.
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
