#pragma once

#include "Appliance.h"
#include "Catalog.h"
#include "Expectations.h"
#include "Messages.h"

#include "support/Program.h"

#include <string>
#include <vector>

namespace orva::test {

using Arguments = std::vector<std::string>;

/// The daemon's locator file.
inline const std::string LOCATOR = "/tmp/zophotodbmerger.conf";

/// Where ZophotosTest::Copy puts a copy of the merged database.
inline const std::string COPY = "/tmp/copy/zophotos.db";

/// The command line of zophotos, for Program.
Arguments ZophotosCommand(Arguments arguments);

/// Runs zophotos. `output` as in Program::Options.
Outcome Zophotos(Arguments arguments, const std::string& output = "");

/// The arguments to run a command on the copy.
Arguments OnCopyArguments(Arguments arguments);

/// Runs zophotos on the copy.
Outcome OnCopy(Arguments arguments);

/// Expects exactly this on standard output, and nothing on standard error.
void ExpectOutput(const Outcome& outcome, const std::string& output, int status = 0);

/// Expects only this on standard error.
void ExpectError(const Outcome& outcome, int status, const std::string& error);

/// The lines of a text.
Lines SplitLines(const std::string& text);

/// Adds a folder of volume A to a copy of the merged database, and a file in it unless `file` is
/// empty. The texts are SQL expressions.
void AddRows(const Database& copy, const std::string& folder, const std::string& file = "");

/// Adds `count` files. Folder id and name are SQL expressions of the number `i`, which begins at 1.
void AddFiles(const Database& copy, int count, const std::string& folderId,
              const std::string& name);

/// Waits until a running zophotos has looked for changes, or tried to, several times.
void AwaitLooks(const Program& program);

/// An empty folder /var/lib for the life of the object. The machine's own may say that the services
/// are installed.
class EmptyStateFolder {
public:
  EmptyStateFolder();
  EmptyStateFolder(const EmptyStateFolder&) = delete;
  EmptyStateFolder& operator=(const EmptyStateFolder&) = delete;
  ~EmptyStateFolder();
};

/// zophotos and the daemon, which has merged four volumes into A: A has all of its photos
/// transcoded, B one of three, C has no photos, and D has one that is not transcoded.
class ZophotosTest : public SystemTest {
protected:
  void SetUp() override;

  /// Adds a photo that has no rendition yet.
  static void AddUntranscoded(Catalog& catalog, const std::string& path);

  /// Lets the daemon merge the changes of a volume.
  void Merge(const Volume& volume) { appliance.Handle(TranscodedBatch(volume.Path())); }

  /// A new copy of the merged database at COPY, for a test to change.
  static Database Copy();

  static inline const std::string MERGED = "/shares/A//.zophotos/zophotos.db";

  const EmptyStateFolder stateFolder;
  const Volume a{"A", "150g"};
  const Volume b{"B", "120g"};
  const Volume c{"C", "1g"};
  const Volume d{"D", "1g"};
  Catalog onA{a};
  Catalog onB{b};
  Catalog onC{c};
  Catalog onD{d};
};

} // namespace orva::test
