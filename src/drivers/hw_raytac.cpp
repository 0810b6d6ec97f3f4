#include "drivers/hw_raytac.hpp"

#include <fcntl.h>
#include <sys/select.h>
#include <unistd.h>

#include "common/log.hpp"
#include "common/paths.hpp"
#include "common/socket.hpp"

RcDriver raytac = {"raytac", RC_RAYTAC_DEVICE_PATH, -1, RaytacOpen, RaytacRead, RaytacClose};

const RcKeyEntry RaytacKeyMap[] = {
    {0x0007004F, RC_ACT_STOP, "Stop"},               // Right Arrow
    {0x00070053, RC_ACT_STOP, "Stop"},               // Keypad Num Lock
    {0x00070051, RC_ACT_RADIO, "Radio"},             // Down Arrow
    {0x00070052, RC_ACT_IPOD, "iPod"},               // Up Arrow
    {0x0007002C, RC_ACT_PLAY, "Play"},               // Spacebar
    {0x00070011, RC_ACT_NEXT, "Next"},               // n
    {0x00070013, RC_ACT_PREV, "Previous"},           // p
    {0x00070057, RC_ACT_VOLUME_UP, "Volume Plus"},   // Keypad +
    {0x00070056, RC_ACT_VOLUME_DOWN, "Volume Minus"},  // Keypad -
    {0x00070058, RC_ACT_TOGGLE_SHUFFLE, "Toggle Shuffle"},  // Keypad Enter
    {0x00070059, RC_ACT_TOGGLE_REPEAT, "Toggle Repeat"},    // Keypad 1
    {0x00070050, RC_ACT_PLAYLIST, "Playlist"},       // Left Arrow
    {0x00070049, RC_ACT_RANDOM100, "Random 100"},    // Insert
    {0x00070061, RC_ACT_CUSTOM1, "Custom 1"},        // Keypad 9
    {0x00070062, RC_ACT_CUSTOM2, "Custom 2"},        // Keypad 0
    {0x00070063, RC_ACT_CUSTOM3, "Custom 3"},        // Keypad .
    {0x00070064, RC_ACT_CUSTOM4, "Custom 4"},        // Non-US backslash
    {0, RC_ACT_NONE, nullptr},
};
static_assert(sizeof RaytacKeyMap / sizeof RaytacKeyMap[0] == RAYTAC_KEY_COUNT + 1);

RaytacHoldState RaytacHold = {0, 0, RC_ACT_NONE};

namespace {

// Reports that came in one read, handed out one per read call in the order
// they came, before the device is waited on again.
RaytacReport pending[RAYTAC_READ_REPORTS];
int pendingCount = 0;  // reports the last read brought
int pendingNext = 0;   // the next of them to hand out

void DropPending()
{
    pendingCount = 0;
    pendingNext = 0;
}

// Offers the last key (if any) with result r.
RaytacHandOver HandOver(const RaytacHoldState& state, RcAction r)
{
    return {r, state.lastCode != 0, state.lastCode};
}

RaytacHandOver OnIdle(RaytacHoldState& state)
{
    if (state.heldAction == RC_ACT_NONE)
        return {RC_ACT_NONE, false, 0};
    // A held volume key steps again at every idle wait, until its release.
    if (RcActionIsVolume(state.heldAction))
        return HandOver(state, state.heldAction);
    if (!RcActionHasLongPress(state.heldAction))
        return HandOver(state, RC_ACT_NONE);
    if (state.idleCycles <= 2) {
        ++state.idleCycles;
        return HandOver(state, RC_ACT_NONE);
    }
    // The fourth idle wait: a long press, given once; the release then gives nothing.
    const RcAction held = RcActionHeldVariant(state.heldAction);
    state.heldAction = RC_ACT_NONE;
    return HandOver(state, held);
}

}  // namespace

const RcKeyEntry* RaytacKeyFind(std::uint32_t usage)
{
    for (const RcKeyEntry* e = RaytacKeyMap; e->label != nullptr; ++e)
        if (e->code == usage)
            return e;
    return nullptr;
}

RaytacHandOver RaytacStep(RaytacHoldState& state, const RaytacEvent& event)
{
    // A dropped read may have held the release of the key that is down: end
    // the hold rather than let a volume key repeat with nobody touching it.
    if (event.lost) {
        state = RaytacHoldState{0, 0, RC_ACT_NONE};
        return {RC_ACT_NONE, false, 0};
    }
    if (event.idle)
        return OnIdle(state);

    RcAction action = RC_ACT_NONE;
    if (event.key.value != RAYTAC_PRESSED) {
        // Released before the long press was reached: the short action, with
        // the code offered once more.
        if (RcActionHasLongPress(state.heldAction)) {
            const RcAction shortAction = state.heldAction;
            state.heldAction = RC_ACT_NONE;
            return HandOver(state, shortAction);
        }
        state.lastCode = 0;
    } else {
        state.lastCode = event.key.hid;
        const RcKeyEntry* entry = RaytacKeyFind(event.key.hid);
        action = entry != nullptr ? entry->action : RC_ACT_UNMAPPED;
    }
    state.idleCycles = 0;
    state.heldAction = action;
    // A long-press key decides at its release or on the idle waits.
    return HandOver(state, RcActionHasLongPress(action) ? RC_ACT_NONE : action);
}

std::int32_t RaytacOpen()
{
    if (raytac.descriptor >= 0)
        return 0;
    const int fd = open(raytac.devicePath, O_RDONLY);
    if (fd < 0)
        return -1;
    raytac.descriptor = fd;
    DropPending();
    // A key that was down when the receiver went away never sends its
    // release to us: forget it, or a held volume key would step on its own
    // at every idle wait.
    RaytacHold = RaytacHoldState{0, 0, RC_ACT_NONE};
    HiddevDescribe(fd);
    return 0;
}

std::int32_t RaytacRead()
{
    const int fd = raytac.descriptor;
    if (fd < 0)
        return 0;

    RaytacEvent event {};
    if (pendingNext < pendingCount) {
        // Read together with an earlier report: handled as if read alone.
        event.key = pending[pendingNext++].events[RAYTAC_KEY_EVENT];
    } else {
        // select cannot watch a descriptor beyond its set; the daemon holds a handful.
        if (fd >= FD_SETSIZE)
            return -1;
        const HiddevWait wait = HiddevWaitReadable(fd, RAYTAC_WAIT_US);
        // Cut short for the daemon to stop: nothing to act on.
        if (wait == HiddevWait::Ended)
            return RC_ACT_NONE;
        if (wait == HiddevWait::TimedOut) {
            event.idle = true;
        } else {
            const ssize_t count = read(fd, pending, sizeof pending);
            if (count < 0)
                return -1;
            const ssize_t reportSize = sizeof(RaytacReport);
            if (count == 0 || count % reportSize != 0) {
                const int bytes = static_cast<int>(count);
                if (count < static_cast<ssize_t>(sizeof(hiddev_event)))
                    LogError(__FILE_NAME__, 304, "Got short read from device!");
                else
                    LogError(__FILE_NAME__, 311, "The hid response is too short. ret:%d (%d)",
                             bytes, bytes / static_cast<int>(sizeof(hiddev_event)));
                event.lost = true;
                RaytacStep(RaytacHold, event);
                return -1;
            }
            pendingCount = static_cast<int>(count / reportSize);
            pendingNext = 1;
            event.key = pending[0].events[RAYTAC_KEY_EVENT];
        }
    }

    const RaytacHandOver result = RaytacStep(RaytacHold, event);
    if (result.offer && MediaCenterSendKey(result.code) == 0)
        return RC_ACT_NONE;
    return result.action;
}

std::int32_t RaytacClose()
{
    if (raytac.descriptor >= 0) {
        close(raytac.descriptor);
        raytac.descriptor = -1;
    }
    DropPending();
    return 0;
}
