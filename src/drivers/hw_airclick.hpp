// AirClick remote driver: five buttons and a release report, read through
// its hiddev device (RC_AIRCLICK_DEVICE_PATH). Each press counts once; a held
// volume button repeats at most once per 200 ms.
//
// Complete but not registered: adding its record to RcDriverTable is all
// that activating it takes.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>

#include "common/rc_types.hpp"

// The driver record.
extern RcDriver airclick;

// The remote's buttons, searched from the top; ends at the entry without a label.
extern const RcKeyEntry AirclickKeyMap[];

// The button code of a release report.
inline constexpr std::uint32_t AIRCLICK_RELEASE_CODE = 0xFB;

// How long one wait for a report lasts, and the least time between two
// repeats of a held volume button, in microseconds.
inline constexpr int AIRCLICK_WAIT_US = 200000;
inline constexpr std::int64_t AIRCLICK_REPEAT_GAP_US = 200000;

// What the driver remembers between reports, all 0 at start.
struct AirclickRepeatState {
    RcAction lastAction;         // the last action reported; 0 after a release
    std::int64_t lastRepeatTime; // when a held volume button last repeated, us since the epoch
};

// The driver's state, process-wide.
extern AirclickRepeatState AirclickRepeat;

// What a report decides: the read returns action, or (done false) drops the
// report and returns 0.
struct AirclickOutcome {
    bool done;
    RcAction action;
};

// The button code of a report of bytes bytes: the value of its fifth event.
// A report of fewer than five events, or whose fifth event's usage has 0 in
// its lowest 8 bits, carries no button (0). Prints the report's "Got value:"
// line to out unless out is null.
std::uint32_t AirclickReportCode(const unsigned char* report, std::size_t bytes, std::FILE* out);

// The action of a button code, printing the label of every matching entry
// to out unless out is null; a release matches without ending the search,
// so it gives 0, as an unknown code does.
RcAction AirclickKeyLookup(std::uint32_t code, std::FILE* out);

// The press filter and volume throttle for one report whose lookup gave
// found, at nowUs microseconds since the epoch.
AirclickOutcome AirclickStep(AirclickRepeatState& state, RcAction found, std::int64_t nowUs);

// Opens the device, or keeps the descriptor already open; 0, or -1 (logged).
std::int32_t AirclickOpen();

// Waits up to 200 ms for one report and handles it: its action (> 0), or 0
// for a release, a dropped repeat or a wait without a report; -1 (logged) on
// a bad read.
std::int32_t AirclickRead();

// Closes the device if it is open; 0.
std::int32_t AirclickClose();
