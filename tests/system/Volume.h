#pragma once

#include <string>

namespace orva::test {

/// A volume of the appliance: a tmpfs of a chosen size below /shares. Only its content takes
/// memory. Unmounted when the object ends.
class Volume {
public:
  /// Creates the directory /shares/`name` and mounts the volume there. `size` as in mount(8)
  /// ("150g"). Throws std::system_error.
  Volume(const std::string& name, const std::string& size);
  Volume(const Volume&) = delete;
  Volume& operator=(const Volume&) = delete;
  ~Volume();

  /// The mount point as the notification service writes it, without a trailing separator.
  const std::string& Path() const { return path_; }
  /// The mount point as the daemon registers it, with a trailing separator.
  std::string MountPoint() const { return path_ + "/"; }

  /// Makes the volume read-only. Throws std::system_error.
  void MakeReadOnly();

  /// Undoes MakeReadOnly. Throws std::system_error.
  void MakeWritable();

  /// Changes the size of the file system, to at least what is used. Throws std::system_error.
  void Resize(double bytes);

  /// Pulls the volume: unmounts it and removes the mount point. Does nothing the second time.
  void Unmount();

  /// Size of the file system in bytes.
  double Capacity() const;
  /// Bytes of the file system that are used now.
  double Used() const;

private:
  std::string path_;
  bool mounted_ = false;
};

} // namespace orva::test
