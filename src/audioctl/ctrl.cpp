#include "audioctl/ctrl.hpp"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <ctime>

#include "audioctl/playlist.hpp"
#include "common/clock.hpp"
#include "common/log.hpp"
#include "common/socket.hpp"
#include "vlibc/audioconf.hpp"
#include "vlibc/vlibc.hpp"

namespace {

// In code order; AudioCmdAt walks it.
constexpr AudioCmdInfo CATALOGUE[] = {
    {AUDIO_CMD_RANDOM100, "AUDIO_CMD_RANDOM100", AudioArgForm::None},
    {AUDIO_CMD_RADIO, "AUDIO_CMD_RADIO", AudioArgForm::None},
    {AUDIO_CMD_IPOD, "AUDIO_CMD_IPOD", AudioArgForm::None},
    {AUDIO_CMD_PLAY, "AUDIO_CMD_PLAY", AudioArgForm::None},
    {AUDIO_CMD_STOP, "AUDIO_CMD_STOP", AudioArgForm::None},
    {AUDIO_CMD_NEXT, "AUDIO_CMD_NEXT", AudioArgForm::None},
    {AUDIO_CMD_PREV, "AUDIO_CMD_PREV", AudioArgForm::None},
    {AUDIO_CMD_8, "AUDIO_CMD_8", AudioArgForm::Decimal},
    {AUDIO_CMD_9, "AUDIO_CMD_9", AudioArgForm::Decimal},
    {AUDIO_CMD_10, "AUDIO_CMD_10", AudioArgForm::None},
    {AUDIO_CMD_11, "AUDIO_CMD_11", AudioArgForm::Decimal},
    {AUDIO_CMD_VOLUME_UP, "AUDIO_CMD_VOLUME_UP", AudioArgForm::None},
    {AUDIO_CMD_VOLUME_DOWN, "AUDIO_CMD_VOLUME_DOWN", AudioArgForm::None},
    {AUDIO_CMD_20, "AUDIO_CMD_20", AudioArgForm::Record},
    {AUDIO_CMD_21, "AUDIO_CMD_21", AudioArgForm::Decimal},
    {AUDIO_CMD_22, "AUDIO_CMD_22", AudioArgForm::None},
    {AUDIO_CMD_23, "AUDIO_CMD_23", AudioArgForm::RecordInt},
    {AUDIO_CMD_24, "AUDIO_CMD_24", AudioArgForm::Decimal},
    {AUDIO_CMD_25, "AUDIO_CMD_25", AudioArgForm::Decimal},
    {AUDIO_CMD_TOGGLE_SHUFFLE, "AUDIO_CMD_TOGGLE_SHUFFLE", AudioArgForm::None},
    {AUDIO_CMD_28, "AUDIO_CMD_28", AudioArgForm::None},
    {AUDIO_CMD_29, "AUDIO_CMD_29", AudioArgForm::None},
    {AUDIO_CMD_TOGGLE_REPEAT, "AUDIO_CMD_TOGGLE_REPEAT", AudioArgForm::None},
    {AUDIO_CMD_PLAYLIST, "AUDIO_CMD_PLAYLIST", AudioArgForm::None},
    {AUDIO_CMD_CUSTOM, "AUDIO_CMD_CUSTOM", AudioArgForm::Decimal},
    {AUDIO_CMD_NEXT_HELD, "AUDIO_CMD_NEXT_HELD", AudioArgForm::None},
    {AUDIO_CMD_PREV_HELD, "AUDIO_CMD_PREV_HELD", AudioArgForm::None},
    {AUDIO_CMD_SET_EQ, "AUDIO_CMD_SET_EQ", AudioArgForm::Bands},
    {AUDIO_CMD_CUSTOM_HELD, "AUDIO_CMD_CUSTOM_HELD", AudioArgForm::Decimal},
};
static_assert(sizeof CATALOGUE / sizeof CATALOGUE[0] == AUDIO_CMD_COUNT);

constexpr bool CatalogueInCodeOrder()
{
    for (int i = 1; i < AUDIO_CMD_COUNT; ++i)
        if (CATALOGUE[i - 1].code >= CATALOGUE[i].code)
            return false;
    return true;
}
static_assert(CatalogueInCodeOrder());

static_assert(sizeof AUDIO_SOCKET_PATH <= sizeof(sockaddr_un::sun_path));

// Waits until fd reports one of events or the monotonic deadline passes; a
// signal does not end the wait early. Returns the reported events, 0 on
// time-out, -1 on error.
int WaitUntilDeadline(int fd, short events, std::int64_t deadlineUs)
{
    for (;;) {
        std::int64_t left = deadlineUs - ClockMonotonicUs();
        if (left < 0)
            left = 0;
        timespec ts {};
        ts.tv_sec = static_cast<time_t>(left / 1000000);
        ts.tv_nsec = static_cast<long>(left % 1000000) * 1000;
        pollfd pfd {fd, events, 0};
        const int n = ppoll(&pfd, 1, &ts, nullptr);
        if (n > 0)
            return pfd.revents;
        if (n == 0)
            return 0;
        if (errno != EINTR)
            return -1;
    }
}

// Connects fd to the audio daemon within the budget. A send time-out bounds
// the connect: when the daemon's listen queue is full, the connect fails with
// EAGAIN after the budget instead of blocking for ever. With a time-out set,
// the kernel does not restart a connect that a signal interrupts, so it is
// tried again for what is left of the budget.
int ConnectBounded(int fd)
{
    sockaddr_un addr;
    SocketFillAddress(addr, AUDIO_SOCKET_PATH);
    const std::int64_t deadline = ClockMonotonicUs() + AUDIO_BUDGET_US;
    std::int64_t left = AUDIO_BUDGET_US;
    for (;;) {
        timeval limit {};
        limit.tv_sec = static_cast<time_t>(left / 1000000);
        limit.tv_usec = static_cast<suseconds_t>(left % 1000000);
        if (setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit) != 0)
            return -1;
        if (connect(fd, reinterpret_cast<const sockaddr*>(&addr), SOCKET_ADDRESS_LENGTH) == 0)
            return 0;
        if (errno != EINTR)
            return -1;
        // Never retried with 0 left: a time-out of 0 would mean no limit at all.
        left = deadline - ClockMonotonicUs();
        if (left <= 0) {
            errno = EAGAIN;  // the budget is spent, as by a connect that timed out
            return -1;
        }
    }
}

// Everything after the connect: both waits share one budget.
std::int32_t Exchange(int fd, const AudioCmdRecord& request, char* reply,
                      std::int32_t replyCapacity)
{
    const std::int64_t deadline = ClockMonotonicUs() + AUDIO_BUDGET_US;

    const int writable = WaitUntilDeadline(fd, POLLOUT, deadline);
    if (writable <= 0)
        return -1;
    if ((writable & POLLOUT) == 0) {
        LogClientError(__FILE_NAME__, 69, "socket is unwritable");
        return -1;
    }
    // One write of the whole record; a peer that went away gives EPIPE, never SIGPIPE.
    const ssize_t sent = send(fd, &request, sizeof request, MSG_NOSIGNAL);
    if (sent != static_cast<ssize_t>(sizeof request)) {
        LogClientError(__FILE_NAME__, 74, "Failed to send command.");
        return -1;
    }

    if (WaitUntilDeadline(fd, POLLIN, deadline) <= 0)
        return -1;
    std::memset(reply, 0, static_cast<std::size_t>(replyCapacity));
    errno = 0;  // a peer that closed without answering reads as 0 bytes, no error
    const ssize_t got = recv(fd, reply, static_cast<std::size_t>(replyCapacity), MSG_DONTWAIT);
    if (got <= 0) {
        LogClientError(__FILE_NAME__, 90, "Failed to read action [%s]", std::strerror(errno));
        return -1;
    }
    return 0;
}

}  // namespace

const AudioCmdInfo* AudioCmdFind(std::int32_t code)
{
    for (const AudioCmdInfo& info : CATALOGUE)
        if (info.code == code)
            return &info;
    return nullptr;
}

const AudioCmdInfo* AudioCmdFindName(const char* name)
{
    if (name == nullptr)
        return nullptr;
    for (const AudioCmdInfo& info : CATALOGUE)
        if (std::strcmp(info.name, name) == 0)
            return &info;
    return nullptr;
}

const AudioCmdInfo* AudioCmdAt(int index)
{
    if (index < 0 || index >= AUDIO_CMD_COUNT)
        return nullptr;
    return &CATALOGUE[index];
}

std::int32_t AudioCtrlTransact(const AudioCmdRecord& request, char* reply,
                               std::int32_t replyCapacity)
{
    if (reply == nullptr || replyCapacity <= 0) {
        LogClientError(__FILE_NAME__, 46, "Bad parameter");
        return -1;
    }
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0)
        return -1;
    if (ConnectBounded(fd) != 0) {
        LogClientError(__FILE_NAME__, 27, "Failed to connect to %s. [%s]", AUDIO_SOCKET_PATH,
                       std::strerror(errno));
        close(fd);
        return -1;
    }
    const std::int32_t result = Exchange(fd, request, reply, replyCapacity);
    close(fd);
    return result;
}

std::int32_t AudioCtrlDeliver(const AudioCmdRecord& request)
{
    char reply[AUDIO_REPLY_SIZE];
    return AudioCtrlTransact(request, reply, sizeof reply);
}

std::int32_t AudioCtrlSendBare(std::int32_t code)
{
    AudioCmdRecord record {};
    record.code = code;
    return AudioCtrlDeliver(record);
}

std::int32_t AudioCtrlSendInt(std::int32_t code, std::int32_t n)
{
    if (AudioPlaylistCheckInt(code, n) != 0)
        return -1;
    AudioCmdRecord record {};
    record.code = code;
    std::snprintf(record.arg, sizeof record.arg, "%d", static_cast<int>(n));
    return AudioCtrlDeliver(record);
}

// ---- Equalizer profile --------------------------------------------------

namespace {

// Profile lines are read in pieces of at most this size, terminator included.
constexpr int EQ_LINE_SIZE = 1024;

// Reads a file in the pieces fgets would return into a 1024-byte buffer:
// up to and including the next newline, at most 1023 characters.
struct PieceReader {
    int fd;
    char buf[EQ_LINE_SIZE];
    int pos;
    int len;
};

// Fills line with the next piece, zero-terminated. False at the end of the
// file, or on a read error.
bool NextPiece(PieceReader& reader, char (&line)[EQ_LINE_SIZE])
{
    int n = 0;
    while (n < EQ_LINE_SIZE - 1) {
        if (reader.pos == reader.len) {
            ssize_t got;
            do {
                got = read(reader.fd, reader.buf, sizeof reader.buf);
            } while (got < 0 && errno == EINTR);
            if (got < 0)
                return false;
            if (got == 0)
                break;
            reader.pos = 0;
            reader.len = static_cast<int>(got);
        }
        const char c = reader.buf[reader.pos++];
        line[n++] = c;
        if (c == '\n')
            break;
    }
    line[n] = '\0';
    return n > 0;
}

// Copies a matching line's value into out, cut to outSize - 1 characters,
// and trims it in place.
std::int32_t TakeValue(const char* value, char* out, std::int32_t outSize)
{
    std::size_t n = std::strlen(value);
    if (n > static_cast<std::size_t>(outSize) - 1)
        n = static_cast<std::size_t>(outSize) - 1;
    std::memcpy(out, value, n);
    out[n] = '\0';
    if (VLIBCStrTrimSpace(out, 0) < 0) {
        LogClientError(__FILE_NAME__, 552, "Failed to trim [%s].", out);
        return -1;
    }
    return 1;
}

}  // namespace

std::int32_t AudioEqLookupProfile(const char* path, const char* name, char* out,
                                  std::int32_t outSize)
{
    if (path == nullptr || name == nullptr || out == nullptr || outSize < 1)
        return -1;
    const int fd = open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0)
        return -1;

    PieceReader reader {fd, {}, 0, 0};
    char line[EQ_LINE_SIZE];
    std::int32_t result = 0;
    while (NextPiece(reader, line)) {
        // The last ':' splits: a name may hold ':', a value never does.
        const char* colon = std::strrchr(line, ':');
        if (colon == nullptr) {
            LogClientError(__FILE_NAME__, 546, "The EQ profile [%s] is illegal.", line);
            result = -1;
            break;
        }
        // The line's name must be the requested name or a prefix of it.
        const auto nameLen = static_cast<std::size_t>(colon - line);
        if (std::strncmp(name, line, nameLen) != 0)
            continue;
        result = TakeValue(colon + 1, out, outSize);
        break;
    }
    close(fd);
    return result;
}

std::int32_t AudioEqGetDefault(char* out, std::int32_t outSize)
{
    char enabled[VEXO_AUDIO_CONF_VALUE_MAX];
    if (VEXOAudioConfGet(AUDIO_CONF_EQ_ENABLE, enabled, sizeof enabled) < 1)
        return 0;
    if (std::strcmp(enabled, "yes") != 0)
        return 0;
    char name[VEXO_AUDIO_CONF_VALUE_MAX];
    if (VEXOAudioConfGet(AUDIO_CONF_EQ_DEFAULT, name, sizeof name) < 1)
        return 0;

    const std::int32_t system = AudioEqLookupProfile(AUDIO_EQ_SYSTEM_FILE, name, out, outSize);
    if (system < 0) {
        LogClientError(__FILE_NAME__, 603, "Failed to open the system EQ profile [%s].",
                       AUDIO_EQ_SYSTEM_FILE);
        return -1;
    }
    if (system > 0)
        return 1;
    return AudioEqLookupProfile(AUDIO_EQ_USER_FILE, name, out, outSize);
}

std::int32_t AudioCtrlSetEqBands(const float (&bands)[AUDIO_EQ_BANDS])
{
    AudioCmdRecord record {};
    record.code = AUDIO_CMD_SET_EQ;
    // Ten values of at most 42 characters and nine spaces: always fits.
    std::size_t used = 0;
    for (int i = 0; i < AUDIO_EQ_BANDS; ++i) {
        if (i > 0)
            record.arg[used++] = ' ';
        const int written = std::snprintf(record.arg + used, sizeof record.arg - used, "%3.1f",
                                          static_cast<double>(bands[i]));
        if (written > 0)
            used += static_cast<std::size_t>(written);
    }
    return AudioCtrlDeliver(record);
}
