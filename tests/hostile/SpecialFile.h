#pragma once

#include <iosfwd>
#include <string>
#include <vector>

namespace orva::test {

/// What a path can name instead of a regular file. The links lead to another file, to a device, and
/// to a missing file.
enum class SpecialKind { Fifo, Socket, Directory, Device, Link, LinkToDevice, DanglingLink };

const std::vector<SpecialKind> SPECIAL_KINDS = {
    SpecialKind::Fifo, SpecialKind::Socket,       SpecialKind::Directory,   SpecialKind::Device,
    SpecialKind::Link, SpecialKind::LinkToDevice, SpecialKind::DanglingLink};

/// Name of the kind.
std::string NameOf(SpecialKind kind);
/// Prints the name.
void PrintTo(SpecialKind kind, std::ostream* stream);

/// Makes a socket at a path. Throws std::system_error.
void MakeSocket(const std::string& path);

/// A special file at a path, for as long as the object lives. A device is a bind mount of one of
/// the private root, whose file system allows no devices.
class SpecialFile {
public:
  /// Replaces what is at the path; a link leads to `target`. Throws std::system_error.
  SpecialFile(SpecialKind kind, std::string path, const std::string& target);
  SpecialFile(const SpecialFile&) = delete;
  SpecialFile& operator=(const SpecialFile&) = delete;
  ~SpecialFile();

private:
  SpecialKind kind_;
  std::string path_;
};

} // namespace orva::test
