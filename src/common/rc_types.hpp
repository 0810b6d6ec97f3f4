// Types shared by the daemon core and its input drivers.
#pragma once

#include <cstdint>

// A remote action: 0 is nothing to do, 1..25 are the defined actions.
using RcAction = std::int32_t;

inline constexpr RcAction RC_ACT_NONE = 0;
inline constexpr RcAction RC_ACT_UNMAPPED = 1;
inline constexpr RcAction RC_ACT_STOP = 2;
inline constexpr RcAction RC_ACT_RANDOM100 = 3;
inline constexpr RcAction RC_ACT_RADIO = 4;
inline constexpr RcAction RC_ACT_IPOD = 5;
inline constexpr RcAction RC_ACT_PLAY = 6;
inline constexpr RcAction RC_ACT_NEXT = 7;
inline constexpr RcAction RC_ACT_PREV = 8;
inline constexpr RcAction RC_ACT_VOLUME_UP = 9;
inline constexpr RcAction RC_ACT_VOLUME_DOWN = 10;
inline constexpr RcAction RC_ACT_RELEASED = 11;
inline constexpr RcAction RC_ACT_RESERVED = 12;
inline constexpr RcAction RC_ACT_TOGGLE_SHUFFLE = 13;
inline constexpr RcAction RC_ACT_TOGGLE_REPEAT = 14;
inline constexpr RcAction RC_ACT_PLAYLIST = 15;
inline constexpr RcAction RC_ACT_CUSTOM1 = 16;
inline constexpr RcAction RC_ACT_CUSTOM2 = 17;
inline constexpr RcAction RC_ACT_CUSTOM3 = 18;
inline constexpr RcAction RC_ACT_CUSTOM4 = 19;
inline constexpr RcAction RC_ACT_NEXT_HELD = 20;
inline constexpr RcAction RC_ACT_PREV_HELD = 21;
inline constexpr RcAction RC_ACT_CUSTOM1_HELD = 22;
inline constexpr RcAction RC_ACT_CUSTOM2_HELD = 23;
inline constexpr RcAction RC_ACT_CUSTOM3_HELD = 24;
inline constexpr RcAction RC_ACT_CUSTOM4_HELD = 25;
// Highest action that the main loop passes to the dispatcher.
inline constexpr RcAction RC_ACT_LAST = RC_ACT_CUSTOM4_HELD;

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
