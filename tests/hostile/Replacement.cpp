#include "Replacement.h"

#include "CraftedLog.h"
#include "Database.h"
#include "SpecialFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <ostream>
#include <system_error>

namespace orva::test {

namespace {

namespace fs = std::filesystem;

// In the directory of the PrivateFiles. The templates are for everybody.
const std::string PRIVATE = "/private";
const std::string TEMPLATES = "/templates";

const std::vector<std::string> DATABASES = {"zophotos.db", "orva.db"};
const std::vector<std::string> LOGS = {
    "zophotos.db-journal", "zophotos.db-wal",         "zophotos.db-shm",
    "zophotos.db.new",     "zophotos.db.new-journal", "zophotos.db.new-wal",
    "zophotos.db.new-shm", "orva.db-journal",         "orva.db-wal",
    "orva.db-shm"};

void Require(bool success, const std::string& what) {
  if (!success) {
    throw std::system_error(errno, std::generic_category(), what);
  }
}

void WritePrivate(const std::string& path, const std::string& content) {
  std::ofstream(path, std::ios::binary) << content;
  Require(chmod(path.c_str(), 0600) == 0, path);
}

bool IsFolder(const std::string& name) {
  return name == ".zophotos" || name == ".orva";
}

bool IsLocator(const std::string& name) {
  return name == "zophotodbmerger.conf";
}

/// The name of the template for a database or one of its logs.
std::string TemplateFor(const std::string& name) {
  return name.starts_with("orva") || name == ".orva" ? "orva.db" : "zophotos.db";
}

std::string PrivateFileFor(const std::string& name, const std::string& directory) {
  const std::string database = directory + PRIVATE + "/databases/" + name;
  const bool isDatabase = std::ranges::find(DATABASES, name) != DATABASES.end();
  return isDatabase ? database : directory + PRIVATE + "/file";
}

void Copy(const std::string& from, const std::string& to) {
  fs::copy_file(from, to);
  fs::permissions(to, fs::perms(0666));
}

util::FileDescriptor Lease(const std::string& path) {
  std::signal(SIGIO, SIG_IGN); // tells that another process opens the file
  util::FileDescriptor file(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0666));
  Require(file && fcntl(file.Get(), F_SETLEASE, F_WRLCK) == 0, path);
  return file;
}

} // namespace

std::string NameOf(Replacement kind) {
  return std::vector<std::string>{
      "LinkToFile",  "LinkToDatabases", "LinkToLogs", "DanglingLink", "HardLink",
      "Fifo",        "OpenFifo",        "Socket",     "Directory",    "EmptyFile",
      "WalDatabase", "HotJournal",      "LeasedFile", "Nothing"}
      .at(static_cast<std::size_t>(kind));
}

void PrintTo(Replacement kind, std::ostream* stream) {
  *stream << NameOf(kind);
}

bool IsFor(Replacement kind, const std::string& name) {
  switch (kind) {
  case Replacement::LinkToLogs:
    return IsFolder(name);
  case Replacement::HotJournal:
    return name.ends_with("-journal");
  case Replacement::WalDatabase:
    return !IsFolder(name) && !IsLocator(name);
  case Replacement::HardLink:
  case Replacement::OpenFifo:
  case Replacement::LeasedFile:
    return !IsFolder(name);
  default:
    return true;
  }
}

PrivateFiles::PrivateFiles(std::string directory, const std::vector<std::string>& databases)
    : directory_(std::move(directory)) {
  const std::string files = directory_ + PRIVATE;
  const std::string templates = directory_ + TEMPLATES;
  for (const std::string& made :
       {directory_, templates, files, files + "/databases", files + "/logs"}) {
    fs::create_directory(made);
  }
  WritePrivate(files + "/file", "content");
  // As a super-journal it names one journal. That journal does not name it, so that a rollback
  // takes the super-journal for a leftover.
  WritePrivate(files + "/super", files + "/child-journal" + '\0');
  WritePrivate(files + "/child-journal", "content");
  for (const std::string& name : LOGS) {
    WritePrivate(files + "/logs/" + name, "content");
  }
  for (const std::string& database : databases) {
    const std::string name = fs::path(database).filename();
    fs::copy_file(database, files + "/databases/" + name);
    Require(chmod((files + "/databases/" + name).c_str(), 0600) == 0, name);

    const std::string copy = templates + "/" + name;
    Copy(database, copy);
    Database(copy).Run("PRAGMA journal_mode = WAL");
    const CraftedDatabase pages(copy);
    CraftedJournal(pages.PageSize(), pages.Pages(), {}, files + "/super").Save(copy + "-journal");
  }
  Require(chmod(files.c_str(), 0700) == 0, files);
  before_ = Tree::Of({files}, [](const std::string&) { return false; });
  watch_ = std::make_unique<WriteWatch>(files, [](const std::string&) { return false; });
}

std::vector<std::string> PrivateFiles::Changes() {
  Tree now = Tree::Of({directory_ + PRIVATE}, [](const std::string&) { return false; });
  std::vector<std::string> changes = now.ChangesSince(before_);
  before_ = std::move(now);
  for (const std::string& write : watch_->Take()) {
    changes.push_back(write);
  }
  return changes;
}

util::FileDescriptor MakeReplacement(Replacement kind, const std::string& path,
                                     const std::string& name, const std::string& directory) {
  const std::string files = directory + PRIVATE;
  const std::string database = directory + TEMPLATES + "/" + TemplateFor(name);
  util::FileDescriptor held;
  switch (kind) {
  case Replacement::LinkToFile:
    fs::create_symlink(PrivateFileFor(name, directory), path);
    break;
  case Replacement::LinkToDatabases:
    fs::create_symlink(files + "/databases", path);
    break;
  case Replacement::LinkToLogs:
    fs::create_symlink(files + "/logs", path);
    break;
  case Replacement::DanglingLink:
    fs::create_symlink(files + "/nothing", path);
    break;
  case Replacement::HardLink:
    fs::create_hard_link(PrivateFileFor(name, directory), path);
    return held;
  case Replacement::Fifo:
  case Replacement::OpenFifo:
    Require(mkfifo(path.c_str(), 0666) == 0, path);
    if (kind == Replacement::OpenFifo) {
      held.Reset(open(path.c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC));
    }
    break;
  case Replacement::Socket:
    MakeSocket(path);
    break;
  case Replacement::Directory:
    fs::create_directory(path);
    if (fs::exists(database)) {
      Copy(database, path + "/" + TemplateFor(name));
    }
    fs::permissions(path, fs::perms(0777));
    break;
  case Replacement::EmptyFile:
    std::ofstream(path).flush();
    break;
  case Replacement::WalDatabase:
    Copy(database, path);
    break;
  case Replacement::HotJournal:
    Copy(database + "-journal", path);
    break;
  case Replacement::LeasedFile:
    held = Lease(path);
    break;
  case Replacement::Nothing:
    break;
  }
  // Fails where the user is not mapped.
  static_cast<void>(lchown(path.c_str(), UNTRUSTED_USER, UNTRUSTED_USER) == 0);
  return held;
}

void Replacer::Replace(Replacement kind, const std::string& path) {
  path_ = path;
  const std::string prepared = directory_ + "/prepared";
  const std::string original = directory_ + "/original";
  for (const std::string& old : {prepared, original, directory_ + "/returned"}) {
    fs::remove_all(old);
  }
  held_ = MakeReplacement(kind, prepared, fs::path(path).filename(), directory_);
  Require(rename(path.c_str(), original.c_str()) == 0 || errno == ENOENT, path);
  Require(rename(prepared.c_str(), path.c_str()) == 0 || errno == ENOENT, path);
}

void Replacer::Return() {
  const std::string returned = directory_ + "/returned";
  fs::remove_all(returned);
  Require(rename(path_.c_str(), returned.c_str()) == 0 || errno == ENOENT, path_);
  Require(rename((directory_ + "/original").c_str(), path_.c_str()) == 0 || errno == ENOENT, path_);
}

} // namespace orva::test
