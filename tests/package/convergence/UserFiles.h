#pragma once

#include "Templates.h"

#include "endurance/Random.h"

#include <cstddef>
#include <map>
#include <set>
#include <string>
#include <vector>

namespace orva::test {

/// What users have put on one disk, and the model of it: every change is made on the disk and in
/// the model. Paths are relative to the disk.
class UserFiles {
public:
  /// For the files below `root`, where nothing is yet.
  UserFiles(std::string root, const Templates& templates)
      : root_(std::move(root)), templates_(&templates) {}

  const std::string& Root() const { return root_; }
  std::string At(const std::string& path) const { return root_ + '/' + path; }

  /// Photos and other files, with their templates.
  const std::map<std::string, std::size_t>& Files() const { return files_; }

  /// Copies a template to `path`, and makes its folder.
  void Copy(std::size_t index, const std::string& path);
  /// The model alone: the test has written the file itself.
  void Note(const std::string& path, std::size_t index) { files_[path] = index; }
  void MakeFolder(const std::string& path);
  void Move(const std::string& from, const std::string& to);
  void Remove(const std::string& path);

  /// Makes a random change that a user could make. `other` is a disk to move a file to.
  void Change(Random& random, UserFiles& other);

  /// The differences between the disk and the model.
  std::vector<std::string> Differences() const;

  /// The model as text, for the next boot.
  std::string Save() const;
  void Load(const std::string& saved);

private:
  void CopyAny(Random& random);
  void MoveFile(Random& random, UserFiles& other);
  void MoveFolder(Random& random);
  void RemoveFolder(Random& random);
  void TouchFile(Random& random) const;
  void MakeSpecialFile(Random& random);
  bool IsTaken(const std::string& path) const;
  std::string AnyFolder(Random& random) const;
  std::string AnyFile(Random& random) const;
  std::string NewPath(Random& random) const;
  std::size_t AnyTemplate(Random& random) const;

  std::string root_;
  const Templates* templates_;
  std::map<std::string, std::size_t> files_;
  std::set<std::string> folders_;  ///< ending in "/"
  std::set<std::string> specials_; ///< links and FIFOs
};

} // namespace orva::test
