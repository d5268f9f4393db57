#pragma once

// The system's own headers that most sources of the daemon use.

#include <syslog.h>

#include <ctime>
#include <memory>
#include <string>
#include <utility>
#include <vector>
