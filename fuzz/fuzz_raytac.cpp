// The radio receiver: reports of any bytes and any size, read through the
// driver's own read as the device would hand them over, interleaved with idle
// waits and with a media-center interface coming and going. The driver's
// decisions are checked against an independent model of the key-hold rules:
// press, release, volume repeat, the long press on the fourth idle wait, and
// the hand-over of every key code to a listening interface.
//
// Input: a sequence of operations, each a byte and its operands:
//   0 idle wait
//   1 k        press key k (k picks one of the 17 mapped keys, or an unmapped usage)
//   2 k v      release of key k with event value v (never 1)
//   3 n n data a raw read of n bytes (0 to 1023): whole reports are each
//              handled as if read alone, anything else is dropped
//   4          a media-center interface appears, or goes
#include <sys/socket.h>
#include <sys/un.h>

#include "common/socket.hpp"
#include "drivers/hw_raytac.hpp"
#include "fuzz_util.hpp"

namespace {

// The receiver's key map, written out again from the table of keys.
struct ModelKey {
    std::uint32_t usage;
    RcAction action;
};
constexpr ModelKey kKeys[] = {
    {0x0007004F, 2},  {0x00070053, 2},  {0x00070051, 4},  {0x00070052, 5},  {0x0007002C, 6},
    {0x00070011, 7},  {0x00070013, 8},  {0x00070057, 9},  {0x00070056, 10}, {0x00070058, 13},
    {0x00070059, 14}, {0x00070050, 15}, {0x00070049, 3},  {0x00070061, 16}, {0x00070062, 17},
    {0x00070063, 18}, {0x00070064, 19},
};
constexpr int kKeyCount = sizeof kKeys / sizeof kKeys[0];

RcAction ModelLookup(std::uint32_t usage)
{
    for (const ModelKey& k : kKeys)
        if (k.usage == usage)
            return k.action;
    return 1;
}

bool ModelLong(RcAction a)
{
    return a == 7 || a == 8 || (a >= 16 && a <= 19);
}

RcAction ModelHeld(RcAction a)
{
    switch (a) {
    case 7: return 20;
    case 8: return 21;
    default: return a + 6;  // 16..19 -> 22..25
    }
}

// The hold rules as the receiver's users expect them.
struct Model {
    std::uint32_t lastCode = 0;
    std::int32_t idle = 0;
    RcAction held = 0;
    bool mediaCenter = false;

    // What the read returns after handing over r.
    RcAction Hand(RcAction r) const { return lastCode != 0 && mediaCenter ? 0 : r; }

    RcAction Idle()
    {
        if (held == 0)
            return 0;
        if (held == 9 || held == 10)
            return Hand(held);
        if (!ModelLong(held))
            return Hand(0);
        if (idle <= 2) {
            ++idle;
            return Hand(0);
        }
        const RcAction v = ModelHeld(held);
        held = 0;
        return Hand(v);
    }

    RcAction Key(std::uint32_t usage, std::int32_t value)
    {
        RcAction action = 0;
        if (value != 1) {
            if (ModelLong(held)) {
                const RcAction r = held;
                held = 0;
                return Hand(r);
            }
            lastCode = 0;
        } else {
            lastCode = usage;
            action = ModelLookup(usage);
        }
        idle = 0;
        held = action;
        return Hand(ModelLong(action) ? 0 : action);
    }

    // A read dropped whole may have held a release: no key is down any more.
    RcAction Lost()
    {
        lastCode = 0;
        idle = 0;
        held = 0;
        return -1;
    }
};

// The device: a packet socket keeps each report one read, as hiddev does.
int deviceWriter = -1;
int mediaCenter = -1;

void SetMediaCenter(bool present)
{
    if (present && mediaCenter < 0) {
        mediaCenter = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
        sockaddr_un addr {};
        addr.sun_family = AF_UNIX;
        std::memcpy(addr.sun_path, MEDIA_CENTER_SOCKET_PATH, sizeof MEDIA_CENTER_SOCKET_PATH);
        unlink(MEDIA_CENTER_SOCKET_PATH);
        if (mediaCenter < 0 || bind(mediaCenter, reinterpret_cast<sockaddr*>(&addr), sizeof addr) != 0)
            std::abort();
    } else if (!present && mediaCenter >= 0) {
        close(mediaCenter);
        mediaCenter = -1;
        unlink(MEDIA_CENTER_SOCKET_PATH);
    }
}

// Takes every datagram the interface was offered: the codes must be those of
// the last key pressed.
void DrainMediaCenter(std::uint32_t lastCode)
{
    std::uint32_t code;
    ssize_t n;
    while (mediaCenter >= 0 && (n = recv(mediaCenter, &code, sizeof code, 0)) >= 0) {
        if (n != sizeof code || code != lastCode || code == 0)
            fz::Fail("the media-center interface got something other than the last key code");
    }
}

RcAction ReadPacket(const std::uint8_t* bytes, std::size_t size)
{
    if (send(deviceWriter, bytes, size, MSG_NOSIGNAL) != static_cast<ssize_t>(size))
        std::abort();
    return RaytacRead();
}

void Check(bool ok, const char* what)
{
    if (!ok)
        fz::Fail(what);
}

// Checks one read (or idle step) against the model.
void Verify(const Model& model, RcAction got, RcAction want)
{
    Check(got == want, "the read's result differs from the hold rules");
    Check(got >= -1 && got <= RC_ACT_LAST, "a result outside the actions");
    Check(RaytacHold.lastCode == model.lastCode && RaytacHold.idleCycles == model.idle &&
              RaytacHold.heldAction == model.held,
          "the hold state differs from the hold rules");
    DrainMediaCenter(model.lastCode);
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***)
{
    fz::RequireSandbox();
    int pair[2];
    if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, pair) != 0)
        std::abort();
    raytac.descriptor = pair[0];
    deviceWriter = pair[1];
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    fz::Reader in(data, size);
    Model model;
    RaytacHold = RaytacHoldState {0, 0, RC_ACT_NONE};
    SetMediaCenter(false);

    while (!in.Empty()) {
        RcAction got = 0;
        RcAction want = 0;
        const std::uint8_t op = in.Byte() % 5;
        if (op == 0) {
            // An idle wait: the step the read takes when its wait ends
            // without a report (waiting 200 ms here would starve the fuzzer).
            const RaytacHandOver h = RaytacStep(RaytacHold, RaytacEvent {true, {}});
            Check(!h.offer || h.code == RaytacHold.lastCode, "an idle wait offered another code");
            got = h.offer && mediaCenter >= 0 ? 0 : h.action;
            if (h.offer && mediaCenter >= 0 && MediaCenterSendKey(h.code) != 0)
                fz::Fail("a listening interface was not reached");
            want = model.Idle();
        } else if (op == 1 || op == 2) {
            const std::uint8_t k = in.Byte();
            const std::uint32_t usage = k % (kKeyCount + 1) < kKeyCount
                                            ? kKeys[k % (kKeyCount + 1)].usage
                                            : in.Word();
            std::int32_t value = 1;
            if (op == 2) {
                value = static_cast<std::int8_t>(in.Byte());
                if (value == 1)
                    value = 0;
            }
            std::uint8_t report[72] = {};
            for (int e = 0; e < 8; ++e)
                report[8 * e + 2] = 0x07;  // other usages of the keyboard page
            std::memcpy(report + 64, &usage, 4);
            std::memcpy(report + 68, &value, 4);
            got = ReadPacket(report, sizeof report);
            want = model.Key(usage, value);
        } else if (op == 3) {
            std::size_t n = (static_cast<std::size_t>(in.Byte()) << 8 | in.Byte()) % 1024;
            const std::uint8_t* bytes = in.Take(n, &n);
            // A datagram of more than the seven reports one read asks for is cut to them.
            const std::size_t seen = n < 7 * 72 ? n : 7 * 72;
            got = ReadPacket(bytes, n);
            if (seen == 0 || seen % 72 != 0) {
                want = model.Lost();
            } else {
                // The first report is this read's; each of the others is the
                // next read's, taken without waiting and without a new packet.
                for (std::size_t r = 0; r < seen / 72; ++r) {
                    std::uint32_t usage;
                    std::int32_t value;
                    std::memcpy(&usage, bytes + 72 * r + 64, 4);
                    std::memcpy(&value, bytes + 72 * r + 68, 4);
                    if (r > 0) {
                        Verify(model, got, want);
                        got = RaytacRead();
                    }
                    want = model.Key(usage, value);
                }
            }
        } else {
            SetMediaCenter(mediaCenter < 0);
            model.mediaCenter = mediaCenter >= 0;
            continue;
        }
        Verify(model, got, want);
    }
    return 0;
}
