#include "common/actions.hpp"

namespace {

// Indexed by the action code; one name for every code 0..RC_ACT_LAST.
constexpr const char* ACTION_NAMES[] = {
    "RC_ACT_NONE",          "RC_ACT_UNMAPPED",       "RC_ACT_STOP",
    "RC_ACT_RANDOM100",     "RC_ACT_RADIO",          "RC_ACT_IPOD",
    "RC_ACT_PLAY",          "RC_ACT_NEXT",           "RC_ACT_PREV",
    "RC_ACT_VOLUME_UP",     "RC_ACT_VOLUME_DOWN",    "RC_ACT_RELEASED",
    "RC_ACT_RESERVED",      "RC_ACT_TOGGLE_SHUFFLE", "RC_ACT_TOGGLE_REPEAT",
    "RC_ACT_PLAYLIST",      "RC_ACT_CUSTOM1",        "RC_ACT_CUSTOM2",
    "RC_ACT_CUSTOM3",       "RC_ACT_CUSTOM4",        "RC_ACT_NEXT_HELD",
    "RC_ACT_PREV_HELD",     "RC_ACT_CUSTOM1_HELD",   "RC_ACT_CUSTOM2_HELD",
    "RC_ACT_CUSTOM3_HELD",  "RC_ACT_CUSTOM4_HELD",
};
static_assert(sizeof ACTION_NAMES / sizeof ACTION_NAMES[0] == RC_ACT_LAST + 1);

}  // namespace

const char* RcActionName(RcAction action)
{
    if (action < RC_ACT_NONE || action > RC_ACT_LAST)
        return nullptr;
    return ACTION_NAMES[action];
}
