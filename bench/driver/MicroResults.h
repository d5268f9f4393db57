#pragma once

#include "Results.h"

#include <string>
#include <vector>

namespace orva::bench {

/// Reads what the micro-benchmarks wrote as CSV: the medians of the benchmarks "WHAT/ours" and
/// "WHAT/theirs". Without the file there are none.
std::vector<MicroResult> ReadMicroResults(const std::string& path);

} // namespace orva::bench
