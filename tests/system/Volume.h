#pragma once

#include <string>

namespace orva::test {

/// A volume of the appliance: a tmpfs of a chosen size below /shares. A size costs no memory;
/// only content does. Unmounted when the object ends.
class Volume {
public:
  /// Mounts the volume at /shares/`name`, making what is missing of that path. `size` as mount
  /// takes it ("150g"). Throws std::system_error.
  Volume(const std::string& name, const std::string& size);
  Volume(const Volume&) = delete;
  Volume& operator=(const Volume&) = delete;
  ~Volume();

  /// The mount point as a service names it, without a trailing separator.
  const std::string& Path() const { return path_; }
  /// The mount point as the daemon registers it, with a trailing separator.
  std::string MountPoint() const { return path_ + "/"; }

  /// Makes everything on the volume unwritable. Throws std::system_error.
  void MakeReadOnly();

  /// Takes MakeReadOnly back. Throws std::system_error.
  void MakeWritable();

  /// Changes the size of the file system to no less than what is used. Throws std::system_error.
  void Resize(double bytes);

  /// Pulls the volume: unmounts it and removes the mount point. Harmless when done before.
  void Unmount();

  /// Size of the file system in bytes.
  double Capacity() const;
  /// Used bytes of the file system at this moment.
  double Used() const;

private:
  std::string path_;
  bool mounted_ = false;
};

} // namespace orva::test
