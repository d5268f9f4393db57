#pragma once

#include "Tree.h"
#include "WriteWatch.h"

#include "orvautil/FileDescriptor.h"

#include <iosfwd>
#include <memory>
#include <string>
#include <vector>

namespace orva::test {

/// What an untrusted user can put at a name that the daemon uses.
enum class Replacement {
  LinkToFile,      ///< one of the private files: a database if the name is that of one
  LinkToDatabases, ///< the directory of the private databases
  LinkToLogs,      ///< the directory of the private files that are named as a database's logs
  DanglingLink,    ///< to a name in the private directory where there is nothing
  HardLink,        ///< to the file of LinkToFile; only root can make it
  Fifo,
  OpenFifo, ///< the user has it open for reading and writing
  Socket,
  Directory,   ///< of the user, with a database in WAL mode
  EmptyFile,   ///< of the user
  WalDatabase, ///< a valid database of the user in WAL mode
  HotJournal,  ///< a valid journal that names a private file as its super-journal
  LeasedFile,  ///< the user holds a write lease on it
  Nothing
};

const std::vector<Replacement> REPLACEMENTS = {
    Replacement::LinkToFile,   Replacement::LinkToDatabases, Replacement::LinkToLogs,
    Replacement::DanglingLink, Replacement::HardLink,        Replacement::Fifo,
    Replacement::OpenFifo,     Replacement::Socket,          Replacement::Directory,
    Replacement::EmptyFile,    Replacement::WalDatabase,     Replacement::HotJournal,
    Replacement::LeasedFile,   Replacement::Nothing};

/// Name of the kind.
std::string NameOf(Replacement kind);
/// Prints the name.
void PrintTo(Replacement kind, std::ostream* stream);

/// The user that owns the replacements.
constexpr unsigned UNTRUSTED_USER = 65534;

/// Whether a replacement of this kind makes sense at a file name, or at a directory's name.
bool IsFor(Replacement kind, const std::string& name);

/// Root's private files in a directory on the file system of the names that are replaced. No
/// replacement may make the daemon change them. Next to them are templates for replacements.
class PrivateFiles {
public:
  /// Makes the files in `directory`, a new one, with copies of `databases`.
  PrivateFiles(std::string directory, const std::vector<std::string>& databases);

  const std::string& Directory() const { return directory_; }

  /// What happened to the files since the last call.
  std::vector<std::string> Changes();

private:
  std::string directory_;
  Tree before_;
  std::unique_ptr<WriteWatch> watch_;
};

/// Makes a replacement for the name `name` at `path`, where there is nothing. `directory` is that
/// of the PrivateFiles. Returns the descriptor that the user holds, if any. Throws
/// std::system_error.
util::FileDescriptor MakeReplacement(Replacement kind, const std::string& path,
                                     const std::string& name, const std::string& directory);

/// Puts a replacement in the place of a file and the file back.
class Replacer {
public:
  explicit Replacer(const PrivateFiles& files) : directory_(files.Directory()) {}

  /// Puts a replacement at `path`. Throws std::system_error.
  void Replace(Replacement kind, const std::string& path);

  /// Puts back at the path what was there before. Keeps the replacement, if it is still there.
  void Return();

private:
  std::string directory_;
  std::string path_;
  util::FileDescriptor held_;
};

} // namespace orva::test
