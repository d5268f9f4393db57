#pragma once

// What nearly every source of the daemon uses: the constants and common system headers.

#include "Constants.h"

#include <syslog.h>

#include <ctime>
#include <memory>
#include <string>
#include <utility>
#include <vector>
