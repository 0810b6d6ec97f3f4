// standin-audiod: a stand-in for the appliance's audio daemon, for tests and
// demonstrations. It listens on the audio daemon's socket, takes one 8196-byte
// command record per connection, prints one readable line per command and
// answers with a few bytes, unless an option makes it misbehave on purpose.
// Records are decoded in the byte order of the machine it runs on.
#include <getopt.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "lib/audio_peer.hpp"
#include "lib/quit.hpp"

namespace {

struct Options {
    AudioPeerMode mode = AudioPeerMode::Answer;
    int delayMs = 0;
    long acceptLimit = -1;  // connections to accept before it stops; -1: no limit
};

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
                 "                        clients queue up in the backlog of %d\n"
                 "  --help                show this text\n"
                 "SIGTERM or SIGINT stops it and removes the socket.\n",
                 argv0, AUDIO_SOCKET_PATH, AUDIO_PEER_ANSWER, AUDIO_PEER_HUGE_ANSWER, AUDIO_PEER_BACKLOG);
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
            opt.mode = AudioPeerMode::AnswerLate;
            opt.delayMs = static_cast<int>(value);
            ++behaviours;
            break;
        case OPT_NEVER:
            opt.mode = AudioPeerMode::NeverAnswer;
            ++behaviours;
            break;
        case OPT_CLOSE:
            opt.mode = AudioPeerMode::CloseWithoutAnswer;
            ++behaviours;
            break;
        case OPT_HUGE:
            opt.mode = AudioPeerMode::AnswerHuge;
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

}  // namespace

int main(int argc, char** argv)
{
    Options opt;
    const int parsed = ParseOptions(argc, argv, opt);
    if (parsed != 0)
        return parsed < 0 ? 0 : parsed;

    std::setvbuf(stdout, nullptr, _IOLBF, 0);
    if (!QuitInstall()) {
        std::perror("standin-audiod: signals");
        return 1;
    }
    AudioPeer peer;
    std::string error;
    if (!peer.Listen(&error)) {
        std::fprintf(stderr, "standin-audiod: %s\n", error.c_str());
        return 1;
    }
    peer.SetMode(opt.mode, opt.delayMs);
    peer.SetAcceptLimit(opt.acceptLimit);
    long served = 0;
    peer.SetObserver([&](const AudioPeerRecord& seen) {
        if (seen.bytes < sizeof seen.record)
            std::printf("short record: %zu of %zu bytes\n", seen.bytes, sizeof seen.record);
        else
            std::printf("%s\n", AudioPeerDescribe(seen.record).c_str());
        if (++served == opt.acceptLimit)
            std::printf("standin-audiod: no longer accepting\n");
    });
    std::printf("standin-audiod: listening on %s\n", AUDIO_SOCKET_PATH);
    if (opt.acceptLimit == 0)
        std::printf("standin-audiod: no longer accepting\n");
    peer.Run(QuitFd());
    return 0;
}
