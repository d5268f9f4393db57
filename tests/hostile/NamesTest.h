#pragma once

#include "CraftedDatabase.h"
#include "Expectations.h"
#include "Replacement.h"

#include <chrono>
#include <map>
#include <string>
#include <thread>

namespace orva::test {

// Names that an untrusted user can replace.
const std::string MERGED_FOLDER = "/shares/Master/.zophotos";
const std::string MERGED_FILE = MERGED_FOLDER + "/zophotos.db";
const std::string CATALOG_FOLDER = "/shares/Vol/.orva";
const std::string CATALOG_FILE = CATALOG_FOLDER + "/orva.db";
const std::string LOCATOR_FILE = "/tmp/zophotodbmerger.conf";

/// The names of a database and of the files that SQLite keeps next to it.
Lines WithLogs(const std::string& database);

/// Kills a process that has not answered in time, so that the test fails and does not hang.
class Watchdog {
public:
  /// A lease on a file stops an opening that waits for it for 45 seconds.
  static constexpr std::chrono::seconds LIMIT{20};

  explicit Watchdog(pid_t process);

private:
  std::jthread thread_;
};

/// A daemon with a master and another volume, both with a catalog. Every user may write to the
/// directories of the master's merged database, of the other volume's catalog, and of the locator.
/// On each of these file systems are private files of root, which must not change.
class NamesTest : public SystemTest {
protected:
  /// Starts the daemon and merges both volumes. The other volume's catalog then has one more photo.
  void SetUp() override;

  /// Puts all files back as they were after SetUp.
  void RestoreFiles() const;

  /// Does the same while an untrusted user replaces names.
  void ExchangeFiles() const;

  /// Waits until the daemon has logged `last`. Throws std::runtime_error when it was killed.
  void AwaitAnswer(const std::string& last);

  /// The private files on the file system of a name.
  const PrivateFiles& FilesFor(const std::string& path) const;

  void ExpectPrivateFilesUnchanged();

  /// Expects that the next merge of the other volume, which is unplugged before if `replug` is set,
  /// is right.
  void ExpectGoodMerge(bool replug);

  /// Expects that the daemon has as many descriptors as after SetUp.
  void ExpectNoMoreDescriptors() const;

  const Volume master{"Master", "150g"};
  const Volume vol{"Vol", "1g"};

private:
  void MakeFiles(const std::string& folder, const std::string& home,
                 const std::string& locator) const;
  std::size_t Descriptors() const;

  Bytes merged_;
  Bytes catalog_;
  Lines good_; ///< what the merged database holds after a good merge
  std::size_t descriptors_ = 0;
  std::map<std::string, PrivateFiles> files_; ///< by the path of a name on the same file system
};

} // namespace orva::test
