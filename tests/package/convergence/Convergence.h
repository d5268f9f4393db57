#pragma once

#include "Templates.h"
#include "UserFiles.h"

#include <map>
#include <string>
#include <vector>

namespace orva::test {

using Lines = std::vector<std::string>;

/// The rows that a query finds, the columns of each joined by '|'. The database is opened
/// read-only. Failures are thrown as SQLite::Exception.
Lines QueryDatabase(const std::string& path, const std::string& sql);

/// What volumes, their catalogs, their renditions and the merged database must say about files that
/// do not change any more. It is made of new catalogs and of a merge with a daemon of its own.
class Convergence {
public:
  /// `volumes` have their files below /shares. All outlive the object.
  Convergence(Templates& templates, const std::vector<const UserFiles*>& volumes);

  /// What is different now.
  Lines Differences() const;

private:
  struct Volume {
    const UserFiles* files = nullptr;
    Lines catalog{};                             ///< rows
    std::map<std::string, std::size_t> photos{}; ///< that are listed, with their templates
  };

  void ExpectVolume(const UserFiles& files);
  void ExpectMerged();
  void CompareCatalog(const Volume& volume, Lines& differences) const;
  void CompareRenditions(const Volume& volume, Lines& differences) const;
  void CompareMerged(Lines& differences) const;
  Lines ReadMerged(const std::string& database) const;

  Templates& templates_;
  std::vector<Volume> volumes_;
  Lines merged_;
};

} // namespace orva::test
