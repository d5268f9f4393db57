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

/// Runs the inspector. `output` as in Program::Streams.
Outcome Zophotos(Arguments arguments, const std::string& output = "");

/// Where ZophotosTest::Copy puts a copy of the merged database.
inline const std::string COPY = "/tmp/copy/zophotos.db";

/// The command line of the inspector, for Program.
Arguments ZophotosCommand(Arguments arguments);

/// The inspector beside the daemon, which has merged four volumes into A: A has all of its photos
/// transcoded, B one of three, C has no photos, and D has one that is not transcoded.
class ZophotosTest : public SystemTest {
protected:
  void SetUp() override;

  /// A photo that has no rendition yet.
  static void AddUntranscoded(Catalog& catalog, const std::string& path);

  /// Lets the daemon merge what is new on a volume.
  void Merge(const Volume& volume) { appliance.Handle(TranscodedBatch(volume.Path())); }

  /// A copy of the merged database for a test to spoil, at COPY.
  static Database Copy();

  /// Runs the inspector on the copy.
  static Outcome OnCopy(Arguments arguments, const std::string& output = "");

  static inline const std::string MERGED = "/shares/A//.zophotos/zophotos.db";

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
