#pragma once

#include "Median.h"

#include <string>
#include <vector>

namespace orva::bench {

/// One quantity measured on one catalog: pairs of values, of the daemon and of what it is compared
/// with. In seconds; memory in bytes.
struct Measurement {
  std::string what; ///< one of the names below
  std::string shape;
  long long files = 0;
  Times daemon{};
  Times horizon{};     ///< empty if not compared
  Times shell{};       ///< of the reader's statements or of DELETE; empty if not compared
  Times floor{};       ///< of the first pairs; empty if not compared
  bool gaveUp = false; ///< the daemon did not finish within the limit
};

inline const std::string FIRST_MERGE = "first merge";
inline const std::string FIRST_MERGE_FILE = "first merge, lines into a file";
inline const std::string FIRST_MERGE_PIPE = "first merge, lines into a pipe";
inline const std::string MERGED_AGAIN = "merged again";
inline const std::string UNCHANGED_MERGE = "unchanged merge";
inline const std::string BATCH_OF_100 = "batch of 100";
inline const std::string BATCH_OF_KNOWN_NAMES = "batch of 100 known names";
inline const std::string SINGLE_ADDITIONS = "100 single additions";
inline const std::string ONE_MORE_FILE = "one more file a folder";
inline const std::string DELETE_ALL = "deletion of every file";
inline const std::string PEAK_MEMORY = "peak memory";

/// The two sides of a micro-benchmark, in nanoseconds of processor time.
struct MicroResult {
  std::string what;
  double ours = 0;
  double theirs = 0;
};

struct Results {
  std::vector<Measurement> measurements;
  std::vector<MicroResult> micro;
};

} // namespace orva::bench
