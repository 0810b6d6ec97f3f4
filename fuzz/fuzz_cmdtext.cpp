// The command records as they reach the audio daemon: integers of any value
// in decimal, ten band values of any bit pattern (NaN, infinities, the
// largest floats), playlist records of any bytes. Each is sent for real to an
// in-process audio daemon on "/tmp/vexoaudiod.sock" and the 8196 bytes it
// receives are checked: the code, the argument in its form, every other byte
// zero, and the refusal of a negative argument where the command has one.
//
// Input: operations, each a byte and its operands:
//   0 c n      a decimal command (c picks the code), n four bytes
//   1 bands    ten four-byte floats
//   2 n rec    a playlist record (the rest of the input, zero-filled), with
//              the integer n for the form that carries one
//   3 c        a command without argument
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <cmath>
#include <condition_variable>
#include <mutex>
#include <string>
#include <thread>

#include "audioctl/ctrl.hpp"
#include "audioctl/playlist.hpp"
#include "fuzz_util.hpp"

namespace {

constexpr std::size_t kRecord = 8196;

// The last record the in-process audio daemon received.
struct Received {
    std::mutex mu;
    unsigned char bytes[kRecord];
    std::size_t got = 0;
    unsigned count = 0;
};
Received received;

void ServeForEver(int listenFd)
{
    static unsigned char buf[kRecord];
    for (;;) {
        const int fd = accept4(listenFd, nullptr, nullptr, SOCK_CLOEXEC);
        if (fd < 0)
            continue;
        std::size_t got = 0;
        while (got < kRecord) {
            pollfd pfd {fd, POLLIN, 0};
            if (poll(&pfd, 1, 1000) != 1)
                break;
            const ssize_t n = read(fd, buf + got, kRecord - got);
            if (n <= 0)
                break;
            got += static_cast<std::size_t>(n);
        }
        {
            std::lock_guard<std::mutex> lock(received.mu);
            std::memcpy(received.bytes, buf, got);
            received.got = got;
            ++received.count;
        }
        (void)!send(fd, "k", 1, MSG_NOSIGNAL);
        close(fd);
    }
}

// Checks the record received last against code and the expected argument area.
void Expect(std::int32_t code, const unsigned char* arg, std::size_t argLen, unsigned countBefore)
{
    std::lock_guard<std::mutex> lock(received.mu);
    if (received.count != countBefore + 1 || received.got != kRecord)
        fz::Fail("the audio daemon did not receive one whole record");
    std::int32_t got;
    std::memcpy(&got, received.bytes, 4);
    if (got != code)
        fz::Fail("wrong command code on the wire");
    if (argLen > 0 && std::memcmp(received.bytes + 4, arg, argLen) != 0)
        fz::Fail("argument differs from its form");
    for (std::size_t i = 4 + argLen; i < kRecord; ++i)
        if (received.bytes[i] != 0)
            fz::Fail("a byte after the argument is not zero");
}

unsigned Count()
{
    std::lock_guard<std::mutex> lock(received.mu);
    return received.count;
}

constexpr std::int32_t kDecimalCodes[] = {AUDIO_CMD_8,  AUDIO_CMD_9,  AUDIO_CMD_11,
                                          AUDIO_CMD_21, AUDIO_CMD_24, AUDIO_CMD_25,
                                          AUDIO_CMD_CUSTOM, AUDIO_CMD_CUSTOM_HELD};

void Decimal(fz::Reader& in)
{
    const std::int32_t code = kDecimalCodes[in.Byte() % 8];
    const auto n = static_cast<std::int32_t>(in.Word());
    const unsigned before = Count();
    const std::int32_t r = AudioCtrlSendInt(code, n);
    if (code == AUDIO_CMD_21 && n < 0) {
        if (r != -1 || Count() != before)
            fz::Fail("a negative argument of command 21 was not refused");
        return;
    }
    if (r != 0)
        fz::Fail("a decimal command failed against a healthy audio daemon");
    // "%d": a minus sign for negative values, no leading zeros, at most 11 characters.
    std::string text;
    std::int64_t v = n;
    const bool negative = v < 0;
    if (negative)
        v = -v;
    do {
        text.insert(text.begin(), static_cast<char>('0' + v % 10));
        v /= 10;
    } while (v != 0);
    if (negative)
        text.insert(text.begin(), '-');
    if (text.size() > 11)
        fz::Fail("a decimal argument longer than 11 characters");
    Expect(code, reinterpret_cast<const unsigned char*>(text.c_str()), text.size() + 1, before);
}

void Bands(fz::Reader& in)
{
    float bands[AUDIO_EQ_BANDS];
    std::string text;
    for (int i = 0; i < AUDIO_EQ_BANDS; ++i) {
        const std::uint32_t bits = in.Word();
        std::memcpy(&bands[i], &bits, sizeof bits);
        char one[64];
        const int len = std::snprintf(one, sizeof one, "%3.1f", static_cast<double>(bands[i]));
        if (len < 3 || len > 42)
            fz::Fail("a band value outside 3 to 42 characters");
        if (i > 0)
            text += ' ';
        text += one;
    }
    if (text.size() > 429)
        fz::Fail("band text longer than 429 characters");
    const unsigned before = Count();
    if (AudioCtrlSetEqBands(bands) != 0)
        fz::Fail("the band command failed against a healthy audio daemon");
    Expect(AUDIO_CMD_SET_EQ, reinterpret_cast<const unsigned char*>(text.c_str()), text.size() + 1,
           before);
}

void Playlist(fz::Reader& in)
{
    const auto n = static_cast<std::int32_t>(in.Word());
    static AudioPlaylistRecord record;
    std::memset(&record, 0, sizeof record);
    std::size_t got = 0;
    const std::uint8_t* bytes = in.Take(sizeof record, &got);
    if (got > 0)
        std::memcpy(&record, bytes, got);
    static unsigned char wire[sizeof record];

    unsigned before = Count();
    std::memcpy(wire, &record, sizeof record);
    if (AudioCtrlSendRecord(AUDIO_CMD_20, &record) != 0)
        fz::Fail("a playlist record failed against a healthy audio daemon");
    Expect(AUDIO_CMD_20, wire, sizeof wire, before);

    before = Count();
    std::memcpy(wire + AUDIO_PLAYLIST_N_OFFSET, &n, sizeof n);
    if (AudioCtrlSendRecordInt(AUDIO_CMD_23, n, &record) != 0)
        fz::Fail("a playlist record with an integer failed against a healthy audio daemon");
    if (record.n != n)
        fz::Fail("the caller's record does not keep the integer");
    Expect(AUDIO_CMD_23, wire, sizeof wire, before);
}

void Bare(fz::Reader& in)
{
    const AudioCmdInfo* info = AudioCmdAt(in.Byte() % AUDIO_CMD_COUNT);
    if (info == nullptr || info->form != AudioArgForm::None)
        return;
    const unsigned before = Count();
    if (AudioCtrlSendBare(info->code) != 0)
        fz::Fail("a command without argument failed against a healthy audio daemon");
    Expect(info->code, nullptr, 0, before);
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***)
{
    fz::RequireSandbox();
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un addr {};
    addr.sun_family = AF_UNIX;
    std::memcpy(addr.sun_path, AUDIO_SOCKET_PATH, sizeof AUDIO_SOCKET_PATH);
    unlink(AUDIO_SOCKET_PATH);
    if (fd < 0 || bind(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr) != 0 ||
        listen(fd, 4) != 0)
        std::abort();
    std::thread(ServeForEver, fd).detach();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    fz::Reader in(data, size);
    for (int ops = 0; !in.Empty() && ops < 16; ++ops) {
        switch (in.Byte() % 4) {
        case 0: Decimal(in); break;
        case 1: Bands(in); break;
        case 2: Playlist(in); break;
        default: Bare(in); break;
        }
    }
    return 0;
}
