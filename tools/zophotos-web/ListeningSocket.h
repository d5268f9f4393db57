#pragma once

#include "Options.h"

#include "orvautil/FileDescriptor.h"

#include <string>

namespace orva::web {

/// The socket to serve: at the address of the command line, the one that systemd passes, or at
/// 127.0.0.1:8480. Throws std::runtime_error or std::system_error, also if other machines can reach
/// it and the command line does not allow that.
util::FileDescriptor OpenListeningSocket(const Options& options);

} // namespace orva::web
