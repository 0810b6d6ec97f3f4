// Remote actions to audio commands.
#pragma once

#include <cstdint>

#include "common/rc_types.hpp"

// What an action sends: a command code (0 for nothing) and, for the custom
// keys, the decimal argument 1..4 (0 for a command without argument).
struct RcActionCommand {
    std::int32_t code;
    std::int32_t arg;
};

// The command an action sends; {0, 0} for the actions without one and for
// values outside 1..25.
RcActionCommand RcDispatchCommandOf(RcAction action);

// Sends the audio command of an action 1..25 in one exchange; nothing for the
// actions without a command. Returns the exchange's result, or 0 if nothing was sent.
std::int32_t RcDispatchAction(RcAction action);
