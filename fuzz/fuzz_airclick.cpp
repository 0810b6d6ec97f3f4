// The AirClick remote: reports of any bytes and sizes. Two roads:
// - the decisions (button code of a report, key-map search, press filter and
//   volume throttle) at clock readings the input chooses, checked against an
//   independent model of the remote's rules: each press counts once, a held
//   volume button repeats at most once per 200 ms since its last repeat;
// - the driver's own read over a packet socket that stands in for the
//   device, for memory safety and the range of its results.
//
// Input: a first byte that picks the road, then reports, each a length byte
// pair and its bytes; on the first road every report is followed by four
// bytes of clock advance (an advance with the top bit set moves the clock back).
#include <sys/socket.h>

#include "drivers/hw_airclick.hpp"
#include "fuzz_util.hpp"

namespace {

RcAction ModelLookup(std::uint32_t code)
{
    switch (code) {
    case 0xFA: return 6;
    case 0xF3: return 7;
    case 0xEB: return 8;
    case 0xF9: return 9;
    case 0xF7: return 10;
    default: return 0;  // the release (0xFB) and unknown codes
    }
}

// The button code: the value of the fifth event when its usage has a non-zero
// low byte; no button otherwise. Reads beyond 512 bytes are never made.
std::uint32_t ModelCode(const std::uint8_t* report, std::size_t bytes)
{
    if (bytes > 512)
        bytes = 512;
    if (bytes < 40)
        return 0;
    std::uint32_t usage;
    std::int32_t value;
    std::memcpy(&usage, report + 32, 4);
    std::memcpy(&value, report + 36, 4);
    return (usage & 0xFF) != 0 ? static_cast<std::uint32_t>(value) : 0;
}

struct Model {
    RcAction last = 0;
    std::int64_t lastRepeat = 0;

    // done: the read returns action; otherwise the report is dropped.
    bool Step(RcAction found, std::int64_t now, RcAction* action)
    {
        if (found != last) {
            last = found;
            *action = found;
            return true;
        }
        if (found != 9 && found != 10)
            return false;
        if (static_cast<std::uint64_t>(now) - static_cast<std::uint64_t>(lastRepeat) <= 199999)
            return false;
        lastRepeat = now;
        *action = found;
        return true;
    }
};

std::FILE* devNull = nullptr;

void Decisions(fz::Reader& in)
{
    AirclickRepeatState state {0, 0};
    Model model;
    std::int64_t now = 1700000000LL * 1000000;
    while (!in.Empty()) {
        std::size_t n = (static_cast<std::size_t>(in.Byte()) << 8 | in.Byte()) % 600;
        const std::uint8_t* report = in.Take(n, &n);
        const std::uint32_t advance = in.Word();
        now += (advance & 0x80000000u) != 0 ? -static_cast<std::int64_t>(advance & 0xFFFFF)
                                             : static_cast<std::int64_t>(advance & 0x3FFFFF);
        if (n < 8)
            continue;  // the read refuses it before any decision
        const std::size_t seen = n < 512 ? n : 512;
        const std::uint32_t code = AirclickReportCode(report, seen, devNull);
        if (code != ModelCode(report, n))
            fz::Fail("button code differs from the fifth event's value");
        const RcAction found = AirclickKeyLookup(code, devNull);
        if (found != ModelLookup(code))
            fz::Fail("key-map search differs");
        const AirclickOutcome got = AirclickStep(state, found, now);
        RcAction want = 0;
        const bool done = model.Step(found, now, &want);
        if (got.done != done || (done && got.action != want))
            fz::Fail("press filter or volume throttle differs from the remote's rules");
        if (state.lastAction != model.last || state.lastRepeatTime != model.lastRepeat)
            fz::Fail("repeat state differs");
    }
}

void Reads(fz::Reader& in)
{
    int pair[2];
    if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, pair) != 0)
        std::abort();
    airclick.descriptor = pair[0];
    int packets = 0;
    while (!in.Empty() && packets < 64) {
        std::size_t n = (static_cast<std::size_t>(in.Byte()) << 8 | in.Byte()) % 1024;
        const std::uint8_t* report = in.Take(n, &n);
        if (send(pair[1], report, n, MSG_NOSIGNAL) != static_cast<ssize_t>(n))
            std::abort();
        ++packets;
    }
    // Once the reports are taken, the device reads as end of file: every
    // read then ends with -1 at once instead of waiting 200 ms.
    shutdown(pair[1], SHUT_WR);
    // Each read takes one report; one more read than reports meets the end.
    for (int calls = 0; calls <= packets; ++calls) {
        const std::int32_t r = AirclickRead();
        if (r < -1 || r > RC_ACT_VOLUME_DOWN || (r > 0 && r < RC_ACT_PLAY))
            fz::Fail("a read result outside the remote's actions");
    }
    AirclickClose();
    close(pair[1]);
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***)
{
    fz::RequireSandbox();
    devNull = std::fopen("/dev/null", "w");
    // The driver prints every report it reads; keep the fuzzer's output readable.
    if (devNull == nullptr || std::freopen("/dev/null", "w", stdout) == nullptr)
        std::abort();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    fz::Reader in(data, size);
    AirclickRepeat = AirclickRepeatState {0, 0};
    if (in.Byte() % 2 == 0)
        Decisions(in);
    else
        Reads(in);
    return 0;
}
