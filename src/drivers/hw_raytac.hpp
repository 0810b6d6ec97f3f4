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
// A signal that cuts the wait short does not end it: it resumes for the time left.
inline constexpr int RAYTAC_WAIT_US = 200000;

// Reports asked for in one read. The kernel hands over every queued event
// that fits, so asking for whole reports keeps each read in step with them.
inline constexpr int RAYTAC_READ_REPORTS = 7;

// What the driver remembers between reads, all 0 at start.
struct RaytacHoldState {
    std::uint32_t lastCode;   // usage of the key last pressed; 0 when none
    std::int32_t idleCycles;  // idle waits in a row while a long-press key is down
    RcAction heldAction;      // action of the key currently down; 0 when none
};

// The receiver's hold state, process-wide; cleared when the device is opened.
extern RaytacHoldState RaytacHold;

// One outcome of a wait on the receiver: an idle wait, the key of a report,
// or a read that was dropped whole (lost).
struct RaytacEvent {
    bool idle;
    hiddev_event key;   // the ninth event of the report when neither idle nor lost
    bool lost = false;  // the read may have held a release: no key is down any more
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

// Opens the receiver (clearing the hold state and any reports left from
// before); 0 when open (already or now), -1 silently.
std::int32_t RaytacOpen();

// Takes the next of the reports that came together in one read, if any;
// else waits up to 200 ms for a report and reads up to seven at once. An
// action (> 0), 0, or -1 on a bad read (a read that is not a whole number of
// reports is dropped, and ends any key hold).
std::int32_t RaytacRead();

// Closes the receiver if it is open, dropping the reports not yet taken; 0.
std::int32_t RaytacClose();
