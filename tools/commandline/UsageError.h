#pragma once

#include <stdexcept>

namespace orva::commandline {

/// The command line is wrong; what() names the argument.
class UsageError : public std::runtime_error {
public:
  using std::runtime_error::runtime_error;
};

} // namespace orva::commandline
