#include "drivers/hw_airclick.hpp"

#include <fcntl.h>
#include <linux/hiddev.h>
#include <sys/select.h>
#include <sys/time.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/log.hpp"
#include "common/paths.hpp"
#include "drivers/hiddev.hpp"

RcDriver airclick = {"airclick", RC_AIRCLICK_DEVICE_PATH, -1, AirclickOpen, AirclickRead, AirclickClose};

const RcKeyEntry AirclickKeyMap[] = {
    {0xFA, RC_ACT_PLAY, "Play"},
    {0xF3, RC_ACT_NEXT, "Next"},
    {0xEB, RC_ACT_PREV, "Previous"},
    {0xF9, RC_ACT_VOLUME_UP, "Volume Plus"},
    {0xF7, RC_ACT_VOLUME_DOWN, "Volume Minus"},
    // Matches, but lets the search run on to the end: a release gives no action.
    {AIRCLICK_RELEASE_CODE, RC_ACT_RELEASED, "Button Released"},
    {0, RC_ACT_NONE, nullptr},
};

AirclickRepeatState AirclickRepeat = {RC_ACT_NONE, 0};

namespace {

// The largest read: hiddev hands over whole events, as many as fit.
constexpr std::size_t AIRCLICK_READ_MAX = 512;
constexpr std::size_t AIRCLICK_MAX_EVENTS = AIRCLICK_READ_MAX / sizeof(hiddev_event);

// The event whose value is the button code.
constexpr std::size_t AIRCLICK_BUTTON_EVENT = 4;

// Events are read from the raw report with memcpy at these offsets.
static_assert(sizeof(hiddev_event) == 8);
static_assert(offsetof(hiddev_event, hid) == 0 && offsetof(hiddev_event, value) == 4);

std::int64_t NowMicroseconds()
{
    timeval tv {};
    gettimeofday(&tv, nullptr);
    return static_cast<std::int64_t>(tv.tv_sec) * 1000000 + tv.tv_usec;
}

}  // namespace

std::uint32_t AirclickReportCode(const unsigned char* report, std::size_t bytes, std::FILE* out)
{
    // Each report stores afresh: an event that stores nothing leaves its 0.
    std::int32_t stored[AIRCLICK_MAX_EVENTS] = {};
    std::size_t events = bytes / sizeof(hiddev_event);
    if (events > AIRCLICK_MAX_EVENTS)
        events = AIRCLICK_MAX_EVENTS;
    if (out != nullptr)
        std::fputs("Got value: ", out);
    for (std::size_t i = 0; i < events; ++i) {
        hiddev_event ev;
        std::memcpy(&ev, report + i * sizeof ev, sizeof ev);
        if ((ev.hid & 0xFFu) == 0)
            continue;
        stored[i] = ev.value;
        if (out != nullptr)
            std::fprintf(out, "%d \t", ev.value);
    }
    if (out != nullptr)
        std::fputc('\n', out);
    return static_cast<std::uint32_t>(stored[AIRCLICK_BUTTON_EVENT]);
}

RcAction AirclickKeyLookup(std::uint32_t code, std::FILE* out)
{
    for (const RcKeyEntry* e = AirclickKeyMap; e->label != nullptr; ++e) {
        if (e->code != code)
            continue;
        if (out != nullptr)
            std::fprintf(out, "%s\n", e->label);
        if (e->action != RC_ACT_RELEASED)
            return e->action;
    }
    return RC_ACT_NONE;
}

AirclickOutcome AirclickStep(AirclickRepeatState& state, RcAction found, std::int64_t nowUs)
{
    // A new button, or the release of the one that was down (0).
    if (found != state.lastAction) {
        state.lastAction = found;
        return {true, found};
    }
    // A repeat of the button that is down: only a volume button repeats, and
    // at most once per gap since its last repeat. The difference is taken
    // unsigned, so a clock set back gives a repeat at once.
    if (!RcActionIsVolume(found))
        return {false, RC_ACT_NONE};
    const std::uint64_t since =
        static_cast<std::uint64_t>(nowUs) - static_cast<std::uint64_t>(state.lastRepeatTime);
    if (since < static_cast<std::uint64_t>(AIRCLICK_REPEAT_GAP_US))
        return {false, RC_ACT_NONE};
    state.lastRepeatTime = nowUs;
    return {true, found};
}

std::int32_t AirclickOpen()
{
    // Opening twice would leak the first descriptor: keep it.
    if (airclick.descriptor >= 0)
        return 0;
    const int fd = open(airclick.devicePath, O_RDONLY);
    if (fd < 0) {
        LogError(__FILE_NAME__, 123, "failed to open %s (%s).", airclick.devicePath,
                 std::strerror(errno));
        return -1;
    }
    airclick.descriptor = fd;
    HiddevDescribe(fd);
    return 0;
}

std::int32_t AirclickRead()
{
    const int fd = airclick.descriptor;
    if (fd < 0)
        return 0;
    // select cannot watch a descriptor beyond its set; the daemon holds a handful.
    if (fd >= FD_SETSIZE)
        return -1;

    // One report per call at most, so that a button that repeats cannot keep
    // the loop from its other drivers and from the quit flag.
    if (HiddevWaitReadable(fd, AIRCLICK_WAIT_US) != HiddevWait::Readable)
        return 0;

    unsigned char report[AIRCLICK_READ_MAX];
    const ssize_t count = read(fd, report, sizeof report);
    if (count < 0) {
        LogError(__FILE_NAME__, 203, "Error reading event.");
        return -1;
    }
    if (count < static_cast<ssize_t>(sizeof(hiddev_event))) {
        LogError(__FILE_NAME__, 205, "Got short read from device!");
        return -1;
    }
    const std::uint32_t code = AirclickReportCode(report, static_cast<std::size_t>(count), stdout);
    const RcAction found = AirclickKeyLookup(code, stdout);
    std::fflush(stdout);
    // A repeat the filter drops gives nothing; the next poll goes on.
    const AirclickOutcome outcome = AirclickStep(AirclickRepeat, found, NowMicroseconds());
    return outcome.done ? outcome.action : RC_ACT_NONE;
}

std::int32_t AirclickClose()
{
    if (airclick.descriptor >= 0) {
        close(airclick.descriptor);
        airclick.descriptor = -1;
    }
    return 0;
}
