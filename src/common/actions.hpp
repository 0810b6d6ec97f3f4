// The remote actions: their codes, the classes the drivers and the
// dispatcher sort them into, and their constant names.
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

// True for the actions that the main loop hands to the dispatcher (1..25).
constexpr bool RcActionIsDispatchable(RcAction a) { return a >= RC_ACT_UNMAPPED && a <= RC_ACT_LAST; }

// Next and Previous.
constexpr bool RcActionIsNextPrev(RcAction a) { return a == RC_ACT_NEXT || a == RC_ACT_PREV; }

// Custom 1 to 4.
constexpr bool RcActionIsCustom(RcAction a) { return a >= RC_ACT_CUSTOM1 && a <= RC_ACT_CUSTOM4; }

// The six actions that have a held variant.
constexpr bool RcActionHasLongPress(RcAction a) { return RcActionIsNextPrev(a) || RcActionIsCustom(a); }

// Volume Plus and Volume Minus, which repeat while held.
constexpr bool RcActionIsVolume(RcAction a)
{
    return a == RC_ACT_VOLUME_UP || a == RC_ACT_VOLUME_DOWN;
}

// The held variant of a long-press action (7 -> 20, 8 -> 21, 16..19 -> 22..25).
constexpr RcAction RcActionHeldVariant(RcAction a)
{
    return RcActionIsNextPrev(a) ? a + (RC_ACT_NEXT_HELD - RC_ACT_NEXT)
                                 : a + (RC_ACT_CUSTOM1_HELD - RC_ACT_CUSTOM1);
}

// Returns the constant name of an action 0..25 ("RC_ACT_PLAY" for 6), or
// nullptr for any other value.
const char* RcActionName(RcAction action);
