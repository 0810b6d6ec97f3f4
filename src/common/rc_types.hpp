// Types shared by the daemon core and its input drivers.
#pragma once

#include <cstdint>

#include "common/actions.hpp"

// One key of a driver's key map; a map ends at the first entry without a label.
struct RcKeyEntry {
    std::uint32_t code;
    RcAction action;
    const char* label;
};

// An input source: a process-wide record owned by its driver's module. The
// operations take no arguments: each driver reaches its own record directly.
struct RcDriver {
    const char* name;
    const char* devicePath;
    std::int32_t descriptor;  // -1 while closed
    std::int32_t (*open)();   // 0 on success, -1 on failure
    std::int32_t (*read)();   // action > 0, 0 for nothing, -1 on error
    std::int32_t (*close)();  // 0
};
