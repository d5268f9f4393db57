#pragma once

#include "Options.h"

#include "orvautil/FileDescriptor.h"

#include <stdexcept>

namespace orva::web {

/// Other machines can reach the address, and the command line does not allow that.
class AddressRefused : public std::runtime_error {
public:
  using std::runtime_error::runtime_error;
};

/// The socket to serve: at the address of the command line, the one that systemd passes, or at
/// 127.0.0.1:8480. Throws AddressRefused, std::runtime_error or std::system_error.
util::FileDescriptor OpenListeningSocket(const Options& options);

} // namespace orva::web
