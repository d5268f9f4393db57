#pragma once

#include "Attempt.h"
#include "Catalog.h"
#include "CraftedDatabase.h"
#include "CraftedLog.h"
#include "DaemonLayerTest.h"
#include "Database.h"
#include "support/TestScale.h"

#include "orvautil/Core.h"

#include <string>
#include <vector>

namespace orva::test {

const std::string MASTER = "/shares/Master/";
const std::string VOLUME = "/shares/Vol/";
const std::string GOOD = "/shares/Good/";
const std::string SPARE = "/shares/Spare/"; ///< a master without a fault
const std::string DECOY = "/shares/Decoy/"; ///< what nobody may touch
const std::string CATALOG = VOLUME + ".orva/orva.db";
const std::string MERGED = MASTER + ".zophotos/zophotos.db";
const std::string VICTIM = DECOY + "victim";
const std::string LOCATOR_PATH = "/tmp/zophotodbmerger.conf";

/// A test with something hostile on a volume. Whatever it is, the same is claimed of the daemon:
/// it comes to an end, within memory in proportion to what is on the volume; its merge is whole or
/// has left one line in the log and no trace; the next merge of a good volume works; and nothing
/// but the merged database was written on the way.
class HostileTest : public DaemonLayerTest {
protected:
  /// Makes a good volume, a master that holds its photos, a volume for the test to spoil, and
  /// decoys.
  HostileTest();
  ~HostileTest() override;

  /// What came of the hostile thing.
  enum class Outcome { Merged, Refused, Broken };

  /// Merges the hostile volume into the good master and then the good volume, and checks the
  /// claims; Broken where they did not hold.
  Outcome MergeHostileVolume();

  /// Does everything that the daemon does with a master to the hostile one, and then merges the
  /// good volume into another master, and checks the claims. Returns the errors of the first
  /// merge and what left the operations, in that order.
  std::vector<std::string> UseHostileMaster();

  /// The error of the last refusal, for tests that know which it has to be.
  const std::string& Refusal() const { return refusal_; }

  /// Puts the merged database of the master back to what the good volume left there.
  void RestoreMaster() const;

  /// The log beside the catalog is SQLite's to write when the catalog is in that mode.
  bool catalogHasWal = false;

private:
  bool MayChange(const std::string& path) const;
  Attempt RunWatched(const std::vector<Operation>& operations);
  void CheckMemory(const Attempt& attempt) const;

  Bytes merged_;      ///< the merged database before a hostile merge
  Lines goodContent_; ///< what it holds after the good volume's next merge
  long long usualMemory_ = 0;
  std::string refusal_;

  bool locatorIsFree_ = false; ///< for the daemon to make

  int attempts_ = 0;
  double longest_ = 0;
  long long mostMemory_ = 0;
};

/// The rows of a catalog that is good: two folders with three photos.
void AddPhotos(Catalog& catalog);

/// The folder that a catalog is in, made.
void MakeCatalogFolder();

/// The bytes that a file or everything in a folder takes on its medium.
long long BytesOnMedium(const std::string& path);

// The beginnings of statements that read numbers x from n: all from 1 on, or the first `count`.
const std::string ENDLESS = "WITH RECURSIVE n(x) AS (SELECT 1 UNION ALL SELECT x + 1 FROM n) ";
std::string Rows(int count);

} // namespace orva::test
