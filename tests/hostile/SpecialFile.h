#pragma once

#include <iosfwd>
#include <string>
#include <vector>

namespace orva::test {

/// What can stand at a name instead of a regular file. The links lead to a file that a test keeps
/// elsewhere, to a device, and nowhere.
enum class SpecialKind { Fifo, Socket, Directory, Device, Link, LinkToDevice, DanglingLink };

const std::vector<SpecialKind> SPECIAL_KINDS = {
    SpecialKind::Fifo, SpecialKind::Socket,       SpecialKind::Directory,   SpecialKind::Device,
    SpecialKind::Link, SpecialKind::LinkToDevice, SpecialKind::DanglingLink};

/// A word for the kind.
std::string NameOf(SpecialKind kind);
/// The same for the names of tests.
void PrintTo(SpecialKind kind, std::ostream* stream);

/// Something of that kind at a path, for as long as the object lives. A device is one that the
/// private root has, mounted there, since its own file system allows none.
class SpecialFile {
public:
  /// Puts it into the place of what is there; `target` is where a link leads. Throws
  /// std::system_error.
  SpecialFile(SpecialKind kind, std::string path, const std::string& target);
  SpecialFile(const SpecialFile&) = delete;
  SpecialFile& operator=(const SpecialFile&) = delete;
  ~SpecialFile();

private:
  SpecialKind kind_;
  std::string path_;
};

} // namespace orva::test
