#include "vexorcd/registry.hpp"

#include <cstring>

#include "drivers/hw_raytac.hpp"
#include "drivers/hw_vexoctrl.hpp"

RcDriver* const RcDriverTable[] = {&raytac, &vexoctrl, nullptr};

namespace {

// Set by the signal handler, taken by the main loop.
volatile std::sig_atomic_t hotplugPending = 0;   // any request since the last service
volatile std::sig_atomic_t hotplugCloseSeen = 0; // a SIGUSR2 since the last service
volatile std::sig_atomic_t hotplugLastOpen = 0;  // the latest request was SIGUSR1

}  // namespace

std::int32_t RcDriversOpenAll(RcDriver* const* table)
{
    std::int32_t acc = 0;
    for (RcDriver* const* d = table; *d != nullptr; ++d)
        acc |= (*d)->open();
    return acc != 0 ? -1 : 0;
}

std::int32_t RcDriversPoll(RcDriver* const* table)
{
    for (RcDriver* const* d = table; *d != nullptr; ++d) {
        const std::int32_t result = (*d)->read();
        if (result > 0)
            return result;
    }
    return 0;
}

std::int32_t RcDriversCloseAll(RcDriver* const* table)
{
    std::int32_t acc = 0;
    for (RcDriver* const* d = table; *d != nullptr; ++d)
        acc |= (*d)->close();
    return acc != 0 ? -1 : 0;
}

void RcDriversList(std::FILE* stream, RcDriver* const* table)
{
    std::fputs("Supported drivers:\n", stream);
    for (RcDriver* const* d = table; *d != nullptr; ++d)
        std::fprintf(stream, "\t%s\n", (*d)->name);
}

RcDriver* RcDriversFind(const char* name, RcDriver* const* table)
{
    for (RcDriver* const* d = table; *d != nullptr; ++d)
        if (std::strcmp((*d)->name, name) == 0)
            return *d;
    return nullptr;
}

void RcOnHotplugSignal(int sig)
{
    if (sig == SIGUSR1) {
        hotplugLastOpen = 1;
    } else if (sig == SIGUSR2) {
        hotplugLastOpen = 0;
        hotplugCloseSeen = 1;
    } else {
        return;
    }
    hotplugPending = 1;
}

void RcDriversServiceHotplug(RcDriver* const* table)
{
    if (hotplugPending == 0)
        return;

    // Take the request with the hot-plug signals held back, so that none
    // arriving meanwhile is half-taken; it is served on the next turn.
    sigset_t block;
    sigset_t saved;
    sigemptyset(&block);
    sigaddset(&block, SIGUSR1);
    sigaddset(&block, SIGUSR2);
    sigprocmask(SIG_BLOCK, &block, &saved);
    const bool closeSeen = hotplugCloseSeen != 0;
    const bool openLast = hotplugLastOpen != 0;
    hotplugPending = 0;
    hotplugCloseSeen = 0;
    hotplugLastOpen = 0;
    sigprocmask(SIG_SETMASK, &saved, nullptr);

    RcDriver* const driver = RcDriversFind(RC_HOTPLUG_DRIVER, table);
    if (driver == nullptr)
        return;
    // An unplug followed by a replug must reach a fresh descriptor, so the
    // close comes first; the latest request decides the final state.
    if (closeSeen)
        driver->close();
    if (openLast)
        driver->open();
}
