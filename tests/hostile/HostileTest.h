#pragma once

#include "Attempt.h"
#include "Catalog.h"
#include "CraftedDatabase.h"
#include "CraftedLog.h"
#include "DaemonLayerTest.h"
#include "Database.h"
#include "support/TestScale.h"

#include "orvautil/Core.h"

#include <cstdint>
#include <random>
#include <string>
#include <vector>

namespace orva::test {

const std::string MASTER = "/shares/Master/";
const std::string VOLUME = "/shares/Vol/";
const std::string GOOD = "/shares/Good/";
const std::string SPARE = "/shares/Spare/"; ///< a good master
const std::string DECOY = "/shares/Decoy/"; ///< must stay unchanged
const std::string CATALOG = VOLUME + ".orva/orva.db";
const std::string MERGED = MASTER + ".zophotos/zophotos.db";
const std::string VICTIM = DECOY + "victim";
const std::string LOCATOR_PATH = "/tmp/zophotodbmerger.conf";

/// A test with hostile files on a volume. In every case the daemon's operations must end, with
/// memory in proportion to what is on the volume; a merge must be complete, or leave one line in
/// the log and nothing else; the next merge of a good volume must work; and only the merged
/// database may be written.
class HostileTest : public DaemonLayerTest {
protected:
  /// Makes a good volume, a master with its photos, a volume for the hostile files, and decoys.
  HostileTest();
  ~HostileTest() override;

  enum class Outcome { Merged, Refused, Broken };

  /// Merges the hostile volume into the good master, then the good volume, and checks what must
  /// hold; Broken where it does not.
  Outcome MergeHostileVolume();

  /// Does everything that the daemon does with a master to the hostile one, then merges the good
  /// volume into another master, and checks what must hold. Returns the logged errors and then
  /// what each operation threw.
  std::vector<std::string> UseHostileMaster();

  /// The error of the last refusal.
  const std::string& Refusal() const { return refusal_; }

  /// Restores the merged database that the good volume's merge left on the master.
  void RestoreMaster() const;

  /// The attempt of the last merge.
  const Attempt& LastAttempt() const { return last_; }

  /// For the attempts, "NAME=value".
  std::vector<std::string> environment;
  std::chrono::seconds deadline = DEADLINE;

  /// SQLite may write the catalog's log: the catalog is in that mode.
  bool catalogHasWal = false;

private:
  bool MayChange(const std::string& path) const;
  Attempt RunWatched(const std::vector<Operation>& operations);
  void CheckMemory(const Attempt& attempt) const;

  Bytes merged_;      ///< the merged database before a hostile merge
  Lines goodContent_; ///< what it holds after the good volume's next merge
  long long usualMemory_ = 0;
  std::string refusal_;
  Attempt last_;

  bool locatorIsFree_ = false; ///< the daemon may create it

  int attempts_ = 0;
  double longest_ = 0;
  long long mostMemory_ = 0;
};

/// Adds the rows of a good catalog: two folders with three photos.
void AddPhotos(Catalog& catalog);

/// Makes the folder of the hostile volume's catalog.
void MakeCatalogFolder();

/// The bytes that the files in a folder take on their medium.
long long BytesOnMedium(const std::string& path);

/// Root page of a table or index.
std::uint32_t RootPage(const std::string& database, const std::string& name);

/// Changes some bytes: anywhere, or where a page has its pointers.
void Mutate(Bytes& file, std::size_t pageSize, std::mt19937& random);

// The beginnings of statements that read numbers x from n: all from 1 on, or the first `count`.
const std::string ENDLESS = "WITH RECURSIVE n(x) AS (SELECT 1 UNION ALL SELECT x + 1 FROM n) ";
std::string Rows(int count);

/// An expression whose evaluation takes a second or two; `term` is a part of it.
std::string ExpensiveValue(const std::string& term);

} // namespace orva::test
