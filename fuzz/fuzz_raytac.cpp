// The radio receiver's read: reports of any bytes and size, as the device
// would hand them over, between idle waits. A read gives -1, 0 or an action
// of the receiver, the hold state stays in its range, and a report of a key
// press leaves that key as the last one.
// Input: steps, each a byte: 0 an idle wait; n below 0x80, one read of 4 n
// of the next bytes, 504 at most (whole reports read together are handed out
// one per read); else a report of one of the remote's keys (or another usage)
// with the next byte as its event value (1, a press, when it is even).
#include <sys/socket.h>

#include "drivers/hw_raytac.hpp"
#include "fuzz_util.hpp"

static void CheckState(std::int32_t result)
{
    const auto action = [](RcAction a) { return a != RC_ACT_RELEASED && a != RC_ACT_RESERVED && a < 26; };
    fz::Check(result >= -1 && action(result), "a result that is no action of the receiver");
    fz::Check(RaytacHold.idleCycles >= 0 && RaytacHold.idleCycles <= 3, "idle waits counted past the long press");
    fz::Check(RaytacHold.heldAction >= 0 && RaytacHold.heldAction < 20 && action(RaytacHold.heldAction),
              "a held action that no key has");
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    static int device = -1;  // a packet socket keeps each write one read, as hiddev does
    int pair[2];
    if (device < 0 && socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, pair) == 0) {
        raytac.descriptor = pair[0];
        device = pair[1];
    }
    RaytacHold = {};
    for (std::size_t i = 0; i < size;) {
        const std::uint8_t step = data[i++];
        // No more than a read asks for: a packet socket would drop the rest, where hiddev keeps it.
        const std::size_t most = sizeof(RaytacReport) * RAYTAC_READ_REPORTS;
        const std::size_t n = std::min({std::size_t {4u} * step, size - i, most});
        if (step == 0) {  // what a read does when 200 ms pass without a report
            const RaytacHandOver h = RaytacStep(RaytacHold, RaytacEvent {true, {}});
            fz::Check(!h.offer || h.code == RaytacHold.lastCode, "an idle wait offered another key");
            CheckState(h.action);
            continue;
        }
        RaytacReport report {};
        std::string bytes;
        if (step < 0x80) {  // the next bytes, whatever they are, as one read
            bytes.assign(reinterpret_cast<const char*>(data + i), n);
            i += n;
        } else {  // a key of the remote (or a usage beside one) reaches the hold logic sooner
            const std::int32_t value = i < size && data[i] % 2 != 0 ? data[i] : RAYTAC_PRESSED;
            i += i < size ? 1 : 0;
            const std::uint32_t usage = RaytacKeyMap[step % (RAYTAC_KEY_COUNT + 1)].code | (step & 0x40u);
            report.events[RAYTAC_KEY_EVENT] = {usage, value};
            bytes.assign(reinterpret_cast<const char*>(&report), sizeof report);
        }
        fz::Check(send(device, bytes.data(), bytes.size(), 0) == static_cast<ssize_t>(bytes.size()), "send");
        const bool whole = !bytes.empty() && bytes.size() % sizeof report == 0;
        for (std::size_t reads = whole ? bytes.size() / sizeof report : 1; reads > 0; --reads)
            CheckState(RaytacRead());  // reports read together are handed out one per read
        hiddev_event key {};  // the last of them is the last key
        if (whole)
            std::memcpy(&key, &bytes[bytes.size() - sizeof report + RAYTAC_KEY_EVENT * sizeof key], sizeof key);
        fz::Check(key.value != RAYTAC_PRESSED || RaytacHold.lastCode == key.hid, "a press not the last key");
    }
    return 0;
}
