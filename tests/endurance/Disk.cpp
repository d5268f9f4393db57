#include "Disk.h"

#include "orvautil/Core.h"

#include <sys/mount.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <system_error>
#include <utility>

namespace orva::test {

namespace {

namespace fs = std::filesystem;

void Check(int result, const std::string& what) {
  if (result != 0) {
    throw std::system_error(errno, std::generic_category(), what);
  }
}

} // namespace

Disk::Disk(std::string name, const std::string& size)
    : name_(std::move(name)), catalogPath_(core::GetCatalogPath(Keeper())) {
  fs::create_directories(Keeper());
  Check(mount("disk", Keeper().c_str(), "tmpfs", 0, ("size=" + size).c_str()), Keeper());
  catalog_ = std::make_unique<Catalog>(Keeper());
}

Disk::~Disk() {
  if (mounted_) {
    Unmount();
  }
  catalog_.reset();
  umount2(Keeper().c_str(), MNT_DETACH);
}

void Disk::Mount() {
  fs::create_directories(Path());
  Check(mount(Keeper().c_str(), Path().c_str(), nullptr, MS_BIND, nullptr), Path());
  mounted_ = true;
  readOnly_ = false;
}

void Disk::Unmount() {
  Check(umount2(Path().c_str(), MNT_DETACH), Path());
  mounted_ = false;
  readOnly_ = false;
}

void Disk::Sweep() const {
  fs::remove_all(Path());
}

void Disk::SetReadOnly(bool readOnly) {
  unsigned long flags = MS_REMOUNT | MS_BIND;
  if (readOnly) {
    flags |= MS_RDONLY;
  }
  Check(mount(nullptr, Path().c_str(), nullptr, flags, nullptr), Path());
  readOnly_ = readOnly;
}

void Disk::SetCatalogState(CatalogState state, Random& random) {
  const std::string away = catalogPath_ + ".away";
  if (state_ != CatalogState::Good) {
    if (withoutTable_) {
      Rows().Run("ALTER TABLE Elsewhere RENAME TO Transcodings");
      withoutTable_ = false;
    } else {
      fs::rename(away, catalogPath_); // replaces what is there
    }
  }
  if (state == CatalogState::Absent) {
    fs::rename(catalogPath_, away);
  } else if (state == CatalogState::Broken && random.Chance(50)) {
    Rows().Run("ALTER TABLE Transcodings RENAME TO Elsewhere");
    withoutTable_ = true;
  } else if (state == CatalogState::Broken) {
    fs::rename(catalogPath_, away);
    std::ofstream(catalogPath_) << std::string(8192, 'x');
  }
  state_ = state;
}

std::string Disk::Change(Random& random) {
  if (state_ != CatalogState::Good) {
    return "nothing"; // SQLite does not write a file that was moved
  }
  if (IsFull()) {
    for (const char* const table : {"Folders", "Files", "Transcodings"}) {
      Rows().Run(std::string("DELETE FROM ") + table);
    }
    return "an empty catalog";
  }
  switch (random.Below(10)) {
  case 0:
  case 1:
    return AddFolder(random);
  case 2:
  case 3:
  case 4:
    return AddPhotos(random);
  case 5:
  case 6:
  case 7:
    return ChangePhoto(random);
  default:
    return ChangeFolder(random);
  }
}

std::string Disk::AddFolder(Random& random) {
  const std::string path = AnyFolder(random) + NewName() + "/";
  catalog_->AddFolder(
      path, stamp_,
      {.backup = random.Chance(5), .hidden = random.Chance(5), .system = random.Chance(5)});
  return "new folder " + path;
}

std::string Disk::AddPhotos(Random& random) {
  const std::string folder = AnyFolder(random);
  const std::size_t count = 1 + random.Below(12);
  Rows().Run("BEGIN");
  for (std::size_t i = 0; i < count; ++i) {
    catalog_->AddPhoto(
        folder + NewName() + ".jpg", stamp_ - 7, std::stol(Stamp(random)),
        {.backup = random.Chance(5), .hidden = random.Chance(5), .system = random.Chance(5)});
  }
  Rows().Run("COMMIT");
  return std::to_string(count) + " new photos in " + folder;
}

std::string Disk::ChangePhoto(Random& random) {
  const std::string path = AnyPhoto(random);
  const std::string its = " WHERE sourceId = (SELECT id FROM Files WHERE path = ?)";
  switch (random.Below(8)) {
  case 0:
  case 1:
  case 2:
    catalog_->DeletePhoto(path, std::stol(Stamp(random)));
    return "deleted photo " + path;
  case 3:
    Rows().Run("UPDATE Files SET isDeleted = 0, lastModifiedDate = ? WHERE path = ?",
               {std::to_string(stamp_), path});
    Rows().Run("UPDATE Transcodings SET status = 1, lastUpdatedDate = ?" + its,
               {Stamp(random), path});
    return "revived photo " + path;
  case 4:
    Rows().Run("UPDATE Transcodings SET status = 2, lastUpdatedDate = ?" + its,
               {Stamp(random), path});
    return "unfinished photo " + path;
  case 5:
    Rows().Run("UPDATE Files SET status = 5 - status, lastModifiedDate = 9 WHERE path = ?", {path});
    return "other status of photo " + path;
  case 6:
    Rows().Run("INSERT INTO Transcodings(sourceId, profile, status, lastUpdatedDate) "
               "SELECT sourceId, profile, status, ? FROM Transcodings" +
                   its,
               {Stamp(random), path});
    return "second rendition of photo " + path;
  default: {
    const std::string name = NewName() + ".jpg";
    Rows().Run("UPDATE Transcodings SET lastUpdatedDate = ?" + its, {Stamp(random), path});
    Rows().Run("UPDATE Files SET name = ?, path = substr(path, 1, length(path) - length(name)) "
               "|| ? WHERE path = ?",
               {name, name, path});
    return "renamed photo " + path;
  }
  }
}

std::string Disk::ChangeFolder(Random& random) {
  const std::string folder = AnyFolder(random);
  if (folder.empty()) {
    return "nothing";
  }
  const std::string below = " WHERE substr(path, 1, length(?)) = ?";
  switch (random.Below(6)) {
  case 0:
    catalog_->DeleteFolder(folder);
    return "deleted only the folder " + folder;
  case 1:
    Rows().Run("UPDATE Folders SET isDeleted = 1" + below, {folder, folder});
    Rows().Run("UPDATE Transcodings SET status = 0, lastUpdatedDate = ? "
               "WHERE sourceId IN (SELECT id FROM Files" +
                   below + ")",
               {Stamp(random), folder, folder});
    Rows().Run("UPDATE Files SET isDeleted = 1" + below, {folder, folder});
    return "deleted all of the folder " + folder;
  case 2:
    Rows().Run("UPDATE Folders SET isDeleted = 0 WHERE path = ?", {folder});
    return "revived folder " + folder;
  case 3:
    Rows().Run("UPDATE Folders SET isHidden = 1 - isHidden WHERE path = ?", {folder});
    return "hidden or shown folder " + folder;
  case 4:
    Rows().Run("DELETE FROM Folders" + below, {folder, folder});
    Rows().Run("DELETE FROM Files" + below, {folder, folder});
    return "forgot the folder " + folder;
  default:
    Rename(folder);
    return "renamed folder " + folder;
  }
}

void Disk::Rename(const std::string& folder) {
  const std::string name = NewName();
  const std::string stem = folder.substr(0, folder.size() - 1);
  const std::size_t separator = stem.rfind('/');
  const std::string renamed =
      (separator == std::string::npos ? "" : stem.substr(0, separator + 1)) + name + "/";
  Rows().Run("UPDATE Folders SET name = ? WHERE path = ?", {name, folder});
  for (const char* const table : {"Folders", "Files"}) {
    Rows().Run(std::string("UPDATE ") + table +
                   " SET path = ? || substr(path, length(?) + 1) WHERE substr(path, 1, length(?)) "
                   "= ?",
               {renamed, folder, folder, folder});
  }
}

/// A name that this disk does not use yet. The names are in no order.
std::string Disk::NewName() {
  static const std::vector<std::string> STEMS{"a", "Summer ", "it's 50%", "\xc3\xa9t\xc3\xa9 ",
                                              "Z", "-",       "%s%n"};
  ++names_;
  return STEMS[static_cast<std::size_t>(names_ * 31) % STEMS.size()] + std::to_string(names_);
}

/// "" is the root of the disk.
std::string Disk::AnyFolder(Random& random) const {
  std::vector<std::string> paths = Rows().Run("SELECT path FROM Folders ORDER BY id");
  paths.emplace_back();
  return random.Of(paths);
}

std::string Disk::AnyPhoto(Random& random) const {
  const std::vector<std::string> paths = Rows().Run("SELECT path FROM Files ORDER BY id");
  return paths.empty() ? "no photo" : random.Of(paths);
}

/// Usually later than all stamps before; if not, a merge need not see the change.
std::string Disk::Stamp(Random& random) {
  stamp_ += static_cast<long>(random.Below(3));
  return std::to_string(random.Chance(10) ? stamp_ - static_cast<long>(random.Below(50)) : stamp_);
}

bool Disk::IsFull() const {
  constexpr std::size_t enough = 400;
  return Rows().Run("SELECT id FROM Files").size() + Rows().Run("SELECT id FROM Folders").size() >
         enough;
}

} // namespace orva::test
