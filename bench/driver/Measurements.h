#pragma once

#include "Options.h"
#include "Results.h"

namespace orva::bench {

/// Makes all the measurements, in a private root; tells on standard error what it is at. Throws
/// std::exception or std::string, also when the daemon, the floor and the horizon do not come to
/// the same rows.
Results Measure(const Options& options);

} // namespace orva::bench
