#pragma once

#include "FaultTest.h"

#include <string>
#include <vector>

namespace orva::test {

/// Errors of the file system on the files whose paths contain `files`: each kind once, and each
/// for good, from an opportunity on. `place` is what the figures call the files.
std::vector<Fault> FileErrors(const std::string& files, const std::string& place);

/// The end of the process, at a change or between two; the same with the loss of all content that
/// was not synced, with the loss of that of the journals alone, and with that of all names besides.
std::vector<Fault> Stops(const std::string& files);

/// Runs the action in a process of its own, which then loses power, with all content and all names
/// that were not synced.
void LosePowerBehind(const Action& action, const std::string& files);

} // namespace orva::test
