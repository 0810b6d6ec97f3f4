#include "vexorcd/dispatch.hpp"

#include "audioctl/ctrl.hpp"
#include "audioctl/playlist.hpp"

namespace {

// Indexed by the action code.
constexpr RcActionCommand ACTION_COMMANDS[] = {
    {0, 0},                          // RC_ACT_NONE: never dispatched
    {0, 0},                          // RC_ACT_UNMAPPED
    {AUDIO_CMD_STOP, 0},             // RC_ACT_STOP
    {AUDIO_CMD_RANDOM100, 0},        // RC_ACT_RANDOM100
    {AUDIO_CMD_RADIO, 0},            // RC_ACT_RADIO
    {AUDIO_CMD_IPOD, 0},             // RC_ACT_IPOD
    {AUDIO_CMD_PLAY, 0},             // RC_ACT_PLAY
    {AUDIO_CMD_NEXT, 0},             // RC_ACT_NEXT
    {AUDIO_CMD_PREV, 0},             // RC_ACT_PREV
    {AUDIO_CMD_VOLUME_UP, 0},        // RC_ACT_VOLUME_UP
    {AUDIO_CMD_VOLUME_DOWN, 0},      // RC_ACT_VOLUME_DOWN
    {0, 0},                          // RC_ACT_RELEASED
    {0, 0},                          // RC_ACT_RESERVED
    {AUDIO_CMD_TOGGLE_SHUFFLE, 0},   // RC_ACT_TOGGLE_SHUFFLE
    {AUDIO_CMD_TOGGLE_REPEAT, 0},    // RC_ACT_TOGGLE_REPEAT
    {AUDIO_CMD_PLAYLIST, 0},         // RC_ACT_PLAYLIST
    {AUDIO_CMD_CUSTOM, 1},           // RC_ACT_CUSTOM1
    {AUDIO_CMD_CUSTOM, 2},           // RC_ACT_CUSTOM2
    {AUDIO_CMD_CUSTOM, 3},           // RC_ACT_CUSTOM3
    {AUDIO_CMD_CUSTOM, 4},           // RC_ACT_CUSTOM4
    {AUDIO_CMD_NEXT_HELD, 0},        // RC_ACT_NEXT_HELD
    {AUDIO_CMD_PREV_HELD, 0},        // RC_ACT_PREV_HELD
    {AUDIO_CMD_CUSTOM_HELD, 1},      // RC_ACT_CUSTOM1_HELD
    {AUDIO_CMD_CUSTOM_HELD, 2},      // RC_ACT_CUSTOM2_HELD
    {AUDIO_CMD_CUSTOM_HELD, 3},      // RC_ACT_CUSTOM3_HELD
    {AUDIO_CMD_CUSTOM_HELD, 4},      // RC_ACT_CUSTOM4_HELD
};
static_assert(sizeof ACTION_COMMANDS / sizeof ACTION_COMMANDS[0] == RC_ACT_LAST + 1);

}  // namespace

RcActionCommand RcDispatchCommandOf(RcAction action)
{
    return RcActionIsDispatchable(action) ? ACTION_COMMANDS[action] : RcActionCommand {0, 0};
}

std::int32_t RcDispatchAction(RcAction action)
{
    const RcActionCommand command = RcDispatchCommandOf(action);
    if (command.code == 0)
        return 0;
    if (command.arg == 0)
        return AudioCtrlSendBare(command.code);
    return AudioCtrlSendInt(command.code, command.arg);
}
