#pragma once

#include <string>
#include <vector>

namespace orva::bench {

/// Runs a program to its end, with its standard output in the file `output`. Returns the seconds
/// from its start to its end. Throws std::runtime_error unless it exits with status 0.
double RunProcess(const std::vector<std::string>& command, const std::string& output);

} // namespace orva::bench
