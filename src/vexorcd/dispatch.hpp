// Remote actions to audio commands.
#pragma once

#include "common/rc_types.hpp"

// Sends the audio command of an action 1..25 in one exchange; nothing for the
// actions without a command. Returns the exchange's result, or 0 if nothing was sent.
std::int32_t RcDispatchAction(RcAction action);
