// Shared with the measurements.
#pragma once

#include "bench/daemon_process.h"
