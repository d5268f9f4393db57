#pragma once

#include "Results.h"

#include <string>
#include <vector>

namespace orva::bench {

/// Reads the CSV output of the micro-benchmarks: the medians of the benchmarks "WHAT/ours" and
/// "WHAT/theirs". Returns none when there is no file.
std::vector<MicroResult> ReadMicroResults(const std::string& path);

} // namespace orva::bench
