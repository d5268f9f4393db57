#pragma once

#include "Options.h"
#include "Results.h"

namespace orva::bench {

/// Makes all the measurements, in a private root, and reports progress on standard error. Throws
/// std::exception or std::string, also when the daemon, the floor and the horizon write different
/// rows.
Results Measure(const Options& options);

} // namespace orva::bench
