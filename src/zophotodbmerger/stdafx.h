#pragma once

// What nearly every source of the daemon uses: the constants, of which each source has its own
// copies, and the system's own headers.

#include "Constants.h"

#include <syslog.h>

#include <ctime>
#include <memory>
#include <string>
#include <utility>
#include <vector>
