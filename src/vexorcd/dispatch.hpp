// Remote actions to audio commands.
#pragma once

#include "common/rc_types.hpp"

// Sends the audio command of an action 1..25 in one exchange; nothing for the
// actions without a command. Returns the exchange's result, or 0 if nothing was sent.
std::int32_t RcDispatchAction(RcAction action);

// True for the actions that the main loop hands to RcDispatchAction (1..25).
constexpr bool RcActionIsDispatchable(RcAction action)
{
    return action >= RC_ACT_UNMAPPED && action <= RC_ACT_LAST;
}

// Returns the constant name of an action 0..25 ("RC_ACT_PLAY" for 6), or
// nullptr for any other value.
const char* RcActionName(RcAction action);
