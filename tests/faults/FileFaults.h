#pragma once

#include "FaultTest.h"

#include <string>
#include <vector>

namespace orva::test {

/// Errors of the file system on the files whose paths contain `files`: each kind once, and each
/// for good, from an opportunity on. `place` is what the figures call the files.
std::vector<Fault> FileErrors(const std::string& files, const std::string& place);

/// The end of the process; the same with the loss of everything that was not synced, and with the
/// loss of that of the journals alone.
std::vector<Fault> Stops(const std::string& files);

} // namespace orva::test
