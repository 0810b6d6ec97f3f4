// standin-audiod: a stand-in for the appliance's audio daemon, for tests and
// demonstrations. It listens on "/tmp/vexoaudiod.sock", takes one 8196-byte
// command record per connection, prints one readable line per command and
// answers with a few bytes, unless an option makes it misbehave on purpose.
// Records are decoded in the byte order of the machine it runs on.
#include <fcntl.h>
#include <getopt.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "audioctl/ctrl.hpp"
#include "audioctl/playlist.hpp"

namespace {

constexpr std::size_t RECORD_SIZE = sizeof(AudioCmdRecord);
// How long a client may take to deliver its record.
constexpr int RECORD_WAIT_MS = 2000;
// The normal answer, and the size of the oversized one.
constexpr char ANSWER[] = "ok";
constexpr std::size_t HUGE_ANSWER = 2 * AUDIO_REPLY_SIZE + 1;

enum class Behaviour { Answer, Delay, NeverAnswer, Close, Huge };

struct Options {
    Behaviour behaviour = Behaviour::Answer;
    int delayMs = 0;
    long acceptLimit = -1;  // connections to accept before it stops; -1: no limit
};

volatile sig_atomic_t quitRequested = 0;
sigset_t waitMask;  // the mask during waits: the quit signals come through

void OnQuit(int /*sig*/)
{
    quitRequested = 1;
}

void Usage(std::FILE* out, const char* argv0)
{
    std::fprintf(out,
                 "usage: %s [OPTION]\n"
                 "A stand-in audio daemon: listens on %s, prints one line per command\n"
                 "record and answers \"%s\". One option makes it misbehave on purpose:\n"
                 "  --delay MS            answer only after MS milliseconds (0..600000)\n"
                 "  --never-answer        keep each connection open without answering\n"
                 "  --close               close each connection without answering\n"
                 "  --huge                answer %zu bytes, more than a client takes\n"
                 "  --stop-accepting[=N]  accept N connections (default 0), then no more;\n"
                 "                        clients queue up in the backlog of 4\n"
                 "  --help                show this text\n"
                 "SIGTERM or SIGINT stops it and removes the socket.\n",
                 argv0, AUDIO_SOCKET_PATH, ANSWER, HUGE_ANSWER);
}

bool ParseCount(const char* text, long max, long& value)
{
    if (text == nullptr)
        return false;
    char* end = nullptr;
    errno = 0;
    const long v = std::strtol(text, &end, 10);
    if (errno != 0 || end == text || *end != '\0' || v < 0 || v > max)
        return false;
    value = v;
    return true;
}

// 0 to run, else the exit status to leave with at once.
int ParseOptions(int argc, char** argv, Options& opt)
{
    enum { OPT_DELAY = 1, OPT_NEVER, OPT_CLOSE, OPT_HUGE, OPT_STOP, OPT_HELP };
    static const option longOptions[] = {
        {"delay", required_argument, nullptr, OPT_DELAY},
        {"never-answer", no_argument, nullptr, OPT_NEVER},
        {"close", no_argument, nullptr, OPT_CLOSE},
        {"huge", no_argument, nullptr, OPT_HUGE},
        {"stop-accepting", optional_argument, nullptr, OPT_STOP},
        {"help", no_argument, nullptr, OPT_HELP},
        {nullptr, 0, nullptr, 0},
    };
    int behaviours = 0;
    for (;;) {
        const int c = getopt_long(argc, argv, "", longOptions, nullptr);
        if (c == -1)
            break;
        long value = 0;
        switch (c) {
        case OPT_DELAY:
            if (!ParseCount(optarg, 600000, value)) {
                std::fprintf(stderr, "%s: --delay takes milliseconds, 0 to 600000\n", argv[0]);
                return 2;
            }
            opt.behaviour = Behaviour::Delay;
            opt.delayMs = static_cast<int>(value);
            ++behaviours;
            break;
        case OPT_NEVER:
            opt.behaviour = Behaviour::NeverAnswer;
            ++behaviours;
            break;
        case OPT_CLOSE:
            opt.behaviour = Behaviour::Close;
            ++behaviours;
            break;
        case OPT_HUGE:
            opt.behaviour = Behaviour::Huge;
            ++behaviours;
            break;
        case OPT_STOP:
            if (optarg != nullptr && !ParseCount(optarg, 1000000, value)) {
                std::fprintf(stderr, "%s: --stop-accepting takes a count\n", argv[0]);
                return 2;
            }
            opt.acceptLimit = value;
            break;
        case OPT_HELP:
            Usage(stdout, argv[0]);
            return -1;
        default:
            Usage(stderr, argv[0]);
            return 2;
        }
    }
    if (optind < argc || behaviours > 1) {
        Usage(stderr, argv[0]);
        return 2;
    }
    return 0;
}

std::int64_t NowMs()
{
    return std::chrono::duration_cast<std::chrono::milliseconds>(
               std::chrono::steady_clock::now().time_since_epoch())
        .count();
}

// Waits for events on the descriptors up to timeoutMs (-1: no limit); a quit
// signal ends the wait. Returns what ppoll returns.
int Wait(std::vector<pollfd>& fds, int timeoutMs)
{
    timespec ts {timeoutMs / 1000, static_cast<long>(timeoutMs % 1000) * 1000000};
    return ppoll(fds.data(), fds.size(), timeoutMs < 0 ? nullptr : &ts, &waitMask);
}

// Reads up to one record from a non-blocking connection; returns the bytes taken.
std::size_t ReadRecord(int fd, unsigned char* record)
{
    const std::int64_t end = NowMs() + RECORD_WAIT_MS;
    std::size_t got = 0;
    while (got < RECORD_SIZE && quitRequested == 0) {
        const std::int64_t left = end - NowMs();
        if (left <= 0)
            break;
        std::vector<pollfd> fds {{fd, POLLIN, 0}};
        if (Wait(fds, static_cast<int>(left)) <= 0)
            continue;
        const ssize_t n = read(fd, record + got, RECORD_SIZE - got);
        if (n == 0 || (n < 0 && errno != EAGAIN && errno != EINTR))
            break;
        if (n > 0)
            got += static_cast<std::size_t>(n);
    }
    return got;
}

// The argument text up to its first zero byte, quoted, with unprintable
// characters escaped. *end receives the offset of the zero byte.
std::string QuotedText(const char* arg, std::size_t* end)
{
    const char* zero = static_cast<const char*>(std::memchr(arg, 0, AUDIO_ARG_SIZE));
    const std::size_t n = zero == nullptr ? AUDIO_ARG_SIZE : static_cast<std::size_t>(zero - arg);
    std::string out = "\"";
    for (std::size_t i = 0; i < n; ++i) {
        const auto c = static_cast<unsigned char>(arg[i]);
        if (c == '"' || c == '\\') {
            out += '\\';
            out += static_cast<char>(c);
        } else if (c >= 0x20 && c < 0x7f) {
            out += static_cast<char>(c);
        } else {
            char hex[8];
            std::snprintf(hex, sizeof hex, "\\x%02x", c);
            out += hex;
        }
    }
    *end = zero == nullptr ? AUDIO_ARG_SIZE : n + 1;
    out += '"';
    return out;
}

// One readable line for a whole record.
std::string Describe(const AudioCmdRecord& record)
{
    const AudioCmdInfo* info = AudioCmdFind(record.code);
    char text[128];
    std::snprintf(text, sizeof text, "%s (%d)", info != nullptr ? info->name : "unknown",
                  static_cast<int>(record.code));
    std::string line = text;
    // Where the argument ends: every byte from there on must be zero.
    std::size_t used = 0;
    switch (info != nullptr ? info->form : AudioArgForm::None) {
    case AudioArgForm::None:
        break;
    case AudioArgForm::Decimal:
    case AudioArgForm::Bands:
        line += ' ';
        line += QuotedText(record.arg, &used);
        break;
    case AudioArgForm::Record:
    case AudioArgForm::RecordInt: {
        AudioPlaylistRecord playlist;
        std::memcpy(&playlist, record.arg, sizeof playlist);
        std::snprintf(text, sizeof text, " record of %zu bytes, int at %d = %d", sizeof playlist,
                      static_cast<int>(AUDIO_PLAYLIST_N_OFFSET), static_cast<int>(playlist.n));
        line += text;
        used = sizeof playlist;
        break;
    }
    }
    const char* const tail = record.arg + used;
    if (std::any_of(tail, record.arg + AUDIO_ARG_SIZE, [](char c) { return c != 0; }))
        line += " [stray bytes after the argument]";
    return line;
}

void SendAnswer(int fd, const char* data, std::size_t size)
{
    // Never blocks: an answer that does not fit is cut, as a busy daemon's would be.
    (void)send(fd, data, size, MSG_NOSIGNAL | MSG_DONTWAIT);
}

// Serves one connection; returns true when the connection is to be kept open.
bool Serve(int fd, const Options& opt)
{
    unsigned char raw[RECORD_SIZE];
    const std::size_t got = ReadRecord(fd, raw);
    if (got < RECORD_SIZE) {
        std::printf("short record: %zu of %zu bytes\n", got, RECORD_SIZE);
        return false;
    }
    AudioCmdRecord record;
    std::memcpy(&record, raw, sizeof record);
    std::printf("%s\n", Describe(record).c_str());

    switch (opt.behaviour) {
    case Behaviour::Answer:
        SendAnswer(fd, ANSWER, sizeof ANSWER - 1);
        return false;
    case Behaviour::Delay: {
        std::vector<pollfd> none;
        Wait(none, opt.delayMs);
        if (quitRequested == 0)
            SendAnswer(fd, ANSWER, sizeof ANSWER - 1);
        return false;
    }
    case Behaviour::NeverAnswer:
        return true;
    case Behaviour::Close:
        return false;
    case Behaviour::Huge: {
        const std::string big(HUGE_ANSWER, 'h');
        SendAnswer(fd, big.data(), big.size());
        return false;
    }
    }
    return false;
}

// A socket file on which someone answers a connect is a live audio daemon.
bool SomeoneListens(const sockaddr_un& addr)
{
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0)
        return false;
    const bool live = connect(fd, reinterpret_cast<const sockaddr*>(&addr), sizeof addr) == 0;
    close(fd);
    return live;
}

int Listen()
{
    sockaddr_un addr {};
    addr.sun_family = AF_UNIX;
    static_assert(sizeof AUDIO_SOCKET_PATH <= sizeof addr.sun_path);
    std::memcpy(addr.sun_path, AUDIO_SOCKET_PATH, sizeof AUDIO_SOCKET_PATH);
    if (SomeoneListens(addr)) {
        std::fprintf(stderr, "standin-audiod: an audio daemon already listens on %s\n",
                     AUDIO_SOCKET_PATH);
        return -1;
    }
    unlink(AUDIO_SOCKET_PATH);
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (fd < 0) {
        std::fprintf(stderr, "standin-audiod: socket: %s\n", std::strerror(errno));
        return -1;
    }
    if (bind(fd, reinterpret_cast<const sockaddr*>(&addr), sizeof addr) != 0 ||
        listen(fd, 4) != 0) {
        std::fprintf(stderr, "standin-audiod: cannot listen on %s: %s\n", AUDIO_SOCKET_PATH,
                     std::strerror(errno));
        close(fd);
        unlink(AUDIO_SOCKET_PATH);
        return -1;
    }
    return fd;
}

void InstallQuitHandlers()
{
    sigset_t quit;
    sigemptyset(&quit);
    sigaddset(&quit, SIGTERM);
    sigaddset(&quit, SIGINT);
    // Held back except inside the waits, so that none slips in between a
    // check of the flag and the next wait.
    sigprocmask(SIG_BLOCK, &quit, &waitMask);
    sigdelset(&waitMask, SIGTERM);
    sigdelset(&waitMask, SIGINT);
    struct sigaction sa {};
    sa.sa_handler = OnQuit;
    sigemptyset(&sa.sa_mask);
    sigaction(SIGTERM, &sa, nullptr);
    sigaction(SIGINT, &sa, nullptr);
    signal(SIGPIPE, SIG_IGN);
}

}  // namespace

int main(int argc, char** argv)
{
    Options opt;
    const int parsed = ParseOptions(argc, argv, opt);
    if (parsed != 0)
        return parsed < 0 ? 0 : parsed;

    std::setvbuf(stdout, nullptr, _IOLBF, 0);
    InstallQuitHandlers();
    const int listenFd = Listen();
    if (listenFd < 0)
        return 1;
    std::printf("standin-audiod: listening on %s\n", AUDIO_SOCKET_PATH);
    if (opt.acceptLimit == 0)
        std::printf("standin-audiod: no longer accepting\n");

    long accepted = 0;
    std::vector<int> held;  // connections kept open by --never-answer
    while (quitRequested == 0) {
        const bool accepting = opt.acceptLimit < 0 || accepted < opt.acceptLimit;
        std::vector<pollfd> fds {{listenFd, static_cast<short>(accepting ? POLLIN : 0), 0}};
        for (int fd : held)
            fds.push_back({fd, POLLIN, 0});
        if (Wait(fds, -1) <= 0)
            continue;
        // A held client that went away (or wrote more): drop its connection.
        for (std::size_t i = 1; i < fds.size(); ++i) {
            if (fds[i].revents == 0)
                continue;
            char sink[256];
            if (read(fds[i].fd, sink, sizeof sink) <= 0) {
                close(fds[i].fd);
                held.erase(std::find(held.begin(), held.end(), fds[i].fd));
            }
        }
        if ((fds[0].revents & POLLIN) == 0)
            continue;
        const int fd = accept4(listenFd, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
        if (fd < 0)
            continue;
        ++accepted;
        if (Serve(fd, opt))
            held.push_back(fd);
        else
            close(fd);
        if (opt.acceptLimit >= 0 && accepted == opt.acceptLimit)
            std::printf("standin-audiod: no longer accepting\n");
    }

    for (int fd : held)
        close(fd);
    close(listenFd);
    unlink(AUDIO_SOCKET_PATH);
    return 0;
}
