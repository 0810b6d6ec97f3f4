// What the two hiddev drivers share: the kernel's event record, the wait for
// a report, and the identification lines printed when a device opens.
#pragma once

#include <linux/hiddev.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>

// The kernel's event record: usage, then value, in the machine's byte order.
static_assert(sizeof(hiddev_event) == 8);
static_assert(offsetof(hiddev_event, hid) == 0 && offsetof(hiddev_event, value) == 4);

// Prints the identification of an open hiddev device to standard output.
void HiddevDescribe(std::int32_t descriptor);

// How a wait for a report ended.
enum class HiddevWait : std::uint8_t {
    Readable,  // a report is there
    TimedOut,  // the whole time passed without one
    Ended,     // cut short: HiddevStopWaiting said so after a signal, or the wait failed
};

// Asked whenever a signal interrupts a wait: true ends the wait at once, false
// (or no predicate) resumes it for the time it has left. The daemon points it
// at its quit flag, so that SIGTERM is seen within one wait while a hot-plug
// signal, which the main loop carries out, costs the wait nothing.
extern bool (*HiddevStopWaiting)();

// Waits up to timeoutUs for a hiddev descriptor (below FD_SETSIZE) to become
// readable.
HiddevWait HiddevWaitReadable(std::int32_t descriptor, long timeoutUs);

// Prints what HiddevDescribe found; a null pointer marks a request that failed.
void HiddevPrint(std::FILE* out, const std::int32_t* version, const hiddev_devinfo* info);
