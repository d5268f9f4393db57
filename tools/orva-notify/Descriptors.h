#pragma once

#include "orvautil/FileDescriptor.h"

namespace orva::notify {

/// Takes over `descriptor`, which a system call returned. Throws util::Exception with errno when it
/// is -1; `what` names what could not be opened.
util::FileDescriptor CheckedDescriptor(int descriptor, const char* what);

/// From now on, SIGINT and SIGTERM do not end the process, but make the returned descriptor
/// (signalfd, non-blocking) readable. To be called before any thread is started. Throws
/// util::Exception.
util::FileDescriptor CatchStopSignals();

} // namespace orva::notify
