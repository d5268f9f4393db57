#pragma once

#include "FaultTest.h"

#include <string>
#include <vector>

namespace orva::test {

/// Errors of the file system on the files whose paths contain `files`: of each kind one that occurs
/// once and one that is permanent. `place` names the files in the figures.
std::vector<Fault> FileErrors(const std::string& files, const std::string& place);

/// The end of the process, at a change or between two; the same with a loss of all content that was
/// not synced, of that of the journals only, and of all names in addition.
std::vector<Fault> Crashes(const std::string& files);

/// Runs the action in a process of its own, which then loses power and with it all content and
/// names that were not synced.
void LosePowerAfter(const Action& action, const std::string& files);

} // namespace orva::test
