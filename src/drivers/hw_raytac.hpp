// Raytac radio receiver driver: the keys of a USB radio remote, reported as
// HID keyboard usages through its hiddev device (RC_RAYTAC_DEVICE_PATH).
//
// Every key is first offered to a listening media-center interface; a key
// whose datagram is delivered is left to it. Next, Previous and Custom 1 to 4
// tell a short press (action at the release) from a long one (held variant on
// the fourth idle wait in a row); the volume keys repeat on every idle wait.
#pragma once

#include <cstddef>
#include <cstdint>

#include "common/rc_types.hpp"
#include "drivers/hiddev.hpp"

// The driver record, first in the registry; SIGUSR1/SIGUSR2 open and close it.
extern RcDriver raytac;

// The receiver's keys, searched from the top; ends at the entry without a label.
extern const RcKeyEntry RaytacKeyMap[];

// Number of keys in RaytacKeyMap, its end entry not counted.
inline constexpr int RAYTAC_KEY_COUNT = 17;

// One key report of the receiver as hiddev delivers it: nine events in the
// machine's byte order, the key in the ninth.
struct RaytacReport {
    hiddev_event events[9];
};
inline constexpr int RAYTAC_KEY_EVENT = 8;
static_assert(sizeof(RaytacReport) == 72);
static_assert(offsetof(RaytacReport, events) + RAYTAC_KEY_EVENT * sizeof(hiddev_event) == 64);

// The event value of a key going down; any other value is a release.
inline constexpr std::int32_t RAYTAC_PRESSED = 1;

// How long one read waits for a report; it paces the volume repeat and the long press.
inline constexpr int RAYTAC_WAIT_US = 200000;

// What the driver remembers between reads, all 0 at start.
struct RaytacHoldState {
    std::uint32_t lastCode;   // usage of the key last pressed; 0 when none
    std::int32_t idleCycles;  // idle waits in a row while a long-press key is down
    RcAction heldAction;      // action of the key currently down; 0 when none
};

// The receiver's hold state, process-wide; cleared when the device is opened.
extern RaytacHoldState RaytacHold;

// One outcome of a wait on the receiver: an idle wait, or the key of a report.
struct RaytacEvent {
    bool idle;
    hiddev_event key;  // the ninth event of the report when not idle
};

// What a step hands over: when offer is set, code goes to the media-center
// interface first and a delivered datagram turns the read's result into 0.
struct RaytacHandOver {
    RcAction action;
    bool offer;
    std::uint32_t code;
};

// The first key-map entry with this usage, or nullptr.
const RcKeyEntry* RaytacKeyFind(std::uint32_t usage);

// The key-hold decision for one wait: updates the state and says what to hand over.
RaytacHandOver RaytacStep(RaytacHoldState& state, const RaytacEvent& event);

// Opens the receiver (clearing the hold state); 0 when open (already or now), -1 silently.
std::int32_t RaytacOpen();

// Waits up to 200 ms for a report; an action (> 0), 0, or -1 on a bad read.
std::int32_t RaytacRead();

// Closes the receiver if it is open; 0.
std::int32_t RaytacClose();
