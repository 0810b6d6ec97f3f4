#include "drivers/hiddev.hpp"

#include <sys/ioctl.h>
#include <sys/select.h>

#include <cerrno>

#include "common/clock.hpp"

bool (*HiddevStopWaiting)() = nullptr;

// The request numbers differ between architectures in their direction bits
// (0x40 on PowerPC, 0x80 on x86); the record sizes are the same on both.
static_assert(sizeof(hiddev_devinfo) == 28);
static_assert(offsetof(hiddev_devinfo, vendor) == 16 && offsetof(hiddev_devinfo, version) == 20 &&
              offsetof(hiddev_devinfo, num_applications) == 24);
#if defined(__powerpc__) && !defined(__powerpc64__)
static_assert(HIDIOCGVERSION == 0x40044801u && HIDIOCGDEVINFO == 0x401C4803u);
#elif defined(__x86_64__) || defined(__i386__)
static_assert(HIDIOCGVERSION == 0x80044801u && HIDIOCGDEVINFO == 0x801C4803u);
#endif

void HiddevPrint(std::FILE* out, const std::int32_t* version, const hiddev_devinfo* info)
{
    if (version != nullptr)
        std::fprintf(out, "hiddev driver version is %d.%d.%d\n", *version >> 16,
                     (*version >> 8) & 0xFF, *version & 0xFF);
    else
        std::fprintf(out, "hiddev driver version is unknown\n");
    if (info == nullptr) {
        std::fprintf(out, "hiddev device information is unavailable\n");
        return;
    }
    // The identifiers are signed 16-bit fields, printed widened with their sign.
    std::fprintf(out, "vendor 0x%04x product 0x%04x version 0x%04x ",
                 static_cast<unsigned>(static_cast<std::int32_t>(info->vendor)),
                 static_cast<unsigned>(static_cast<std::int32_t>(info->product)),
                 static_cast<unsigned>(static_cast<std::int32_t>(info->version)));
    std::fprintf(out, "has %i application%s ", static_cast<int>(info->num_applications),
                 info->num_applications == 1 ? "" : "s");
    std::fprintf(out, "and is on bus: %d devnum: %d ifnum: %d\n", static_cast<int>(info->busnum),
                 static_cast<int>(info->devnum), static_cast<int>(info->ifnum));
}

HiddevWait HiddevWaitReadable(std::int32_t descriptor, long timeoutUs)
{
    // A wait that a signal cut short resumes for what is left of it, taken
    // from the monotonic clock (select does not say, under an emulator).
    const std::int64_t deadline = ClockMonotonicUs() + timeoutUs;
    std::int64_t left = timeoutUs;
    for (;;) {
        fd_set readable;
        FD_ZERO(&readable);
        FD_SET(descriptor, &readable);
        timeval wait {static_cast<time_t>(left / 1000000), static_cast<suseconds_t>(left % 1000000)};
        const int ready = select(descriptor + 1, &readable, nullptr, nullptr, &wait);
        if (ready > 0)
            return HiddevWait::Readable;
        if (ready == 0)
            return HiddevWait::TimedOut;
        if (errno != EINTR || (HiddevStopWaiting != nullptr && HiddevStopWaiting()))
            return HiddevWait::Ended;
        left = deadline - ClockMonotonicUs();
        if (left < 0)
            left = 0;
    }
}

void HiddevDescribe(std::int32_t descriptor)
{
    int version = 0;
    hiddev_devinfo info {};
    const bool haveVersion = ioctl(descriptor, HIDIOCGVERSION, &version) == 0;
    const bool haveInfo = ioctl(descriptor, HIDIOCGDEVINFO, &info) == 0;
    const std::int32_t v = version;
    HiddevPrint(stdout, haveVersion ? &v : nullptr, haveInfo ? &info : nullptr);
    std::fflush(stdout);
}
