// vexorctl: the companion client of vexorcd, for the appliance's scripts and
// engineers. It sends remote actions to the daemon's control socket, each on
// its own connection, and waits until the daemon has taken each one.
//
// Commands are rows of one table, so that further groups (the audio side,
// say) are added as rows with a handler of their own.
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cinttypes>
#include <climits>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "common/rc_types.hpp"
#include "vexorcd/dispatch.hpp"

namespace {

constexpr char PROGRAM[] = "vexorctl";
constexpr char CONTROL_SOCKET[] = "/tmp/vexoctrl";

// How long the daemon may take to accept a connection and to read its
// action: one poll of the receiver plus one audio exchange take well under a
// second, so this only ends a wait on a daemon that has stopped serving.
constexpr int TAKE_TIMEOUT_MS = 5000;

// Exit statuses, as the usage text documents them.
constexpr int EXIT_DELIVERED = 0;
constexpr int EXIT_NOT_DELIVERED = 1;
constexpr int EXIT_USAGE = 2;

// Longest action name: "toggle-shuffle" and the like.
constexpr std::size_t NAME_MAX_LEN = 32;

// The user-facing name of an action: its constant's name without the prefix,
// in lower case with dashes ("RC_ACT_VOLUME_UP" -> "volume-up"). False for
// values without a name.
bool ActionSlug(RcAction action, char (&out)[NAME_MAX_LEN])
{
    const char* name = RcActionName(action);
    if (name == nullptr)
        return false;
    constexpr char PREFIX[] = "RC_ACT_";
    if (std::strncmp(name, PREFIX, sizeof PREFIX - 1) == 0)
        name += sizeof PREFIX - 1;
    std::size_t i = 0;
    for (; name[i] != '\0' && i + 1 < sizeof out; ++i)
        out[i] = name[i] == '_' ? '-' : static_cast<char>(std::tolower(static_cast<unsigned char>(name[i])));
    out[i] = '\0';
    return true;
}

// Case and '_' versus '-' do not matter in names typed by people.
bool SameName(const char* typed, const char* slug)
{
    for (; *typed != '\0' && *slug != '\0'; ++typed, ++slug) {
        const char c = *typed == '_' ? '-' : static_cast<char>(std::tolower(static_cast<unsigned char>(*typed)));
        if (c != *slug)
            return false;
    }
    return *typed == *slug;
}

// A decimal code within 32 signed bits, or a hexadecimal bit pattern
// "0x..." of up to 32 bits.
bool ParseNumber(const char* text, RcAction& out)
{
    const bool hex = text[0] == '0' && (text[1] == 'x' || text[1] == 'X');
    if (*text == '\0' || std::isspace(static_cast<unsigned char>(*text)) || (hex && text[2] == '\0'))
        return false;
    char* end = nullptr;
    errno = 0;
    if (hex) {
        if (text[2] == '-' || text[2] == '+')
            return false;
        const unsigned long long v = std::strtoull(text + 2, &end, 16);
        if (errno != 0 || *end != '\0' || v > UINT32_MAX)
            return false;
        const std::uint32_t bits = static_cast<std::uint32_t>(v);
        std::memcpy(&out, &bits, sizeof out);
        return true;
    }
    const long long v = std::strtoll(text, &end, 10);
    if (errno != 0 || *end != '\0' || v < INT32_MIN || v > INT32_MAX)
        return false;
    out = static_cast<RcAction>(v);
    return true;
}

// An action by name or by number.
bool ParseAction(const char* text, RcAction& out)
{
    char slug[NAME_MAX_LEN];
    for (RcAction a = RC_ACT_NONE; ActionSlug(a, slug); ++a) {
        if (SameName(text, slug)) {
            out = a;
            return true;
        }
    }
    return ParseNumber(text, out);
}

void Usage(std::FILE* out);

// Reports a usage error, naming the offending word if there is one; returns
// the usage exit status.
int UsageError(const char* what, const char* word = nullptr)
{
    if (word != nullptr)
        std::fprintf(stderr, "%s: %s '%s'\n", PROGRAM, what, word);
    else
        std::fprintf(stderr, "%s: %s\n", PROGRAM, what);
    std::fprintf(stderr, "Try '%s --help' or '%s --list'.\n", PROGRAM, PROGRAM);
    return EXIT_USAGE;
}

void Fail(const char* what, const char* action)
{
    std::fprintf(stderr, "%s: %s: %s (%s)\n", PROGRAM, action, what, std::strerror(errno));
}

// Connects to the control socket, writes the 4 bytes of the action in this
// machine's byte order and waits until the daemon has read them and hung up.
// Messages name the action as the user typed it.
bool SendOne(RcAction action, const char* typed)
{
    sockaddr_un addr {};
    addr.sun_family = AF_UNIX;
    static_assert(sizeof CONTROL_SOCKET <= sizeof addr.sun_path);
    std::memcpy(addr.sun_path, CONTROL_SOCKET, sizeof CONTROL_SOCKET);

    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0) {
        Fail("cannot create a socket", typed);
        return false;
    }
    // A daemon whose listening queue is full would otherwise hold the
    // connect for good.
    const timeval limit {TAKE_TIMEOUT_MS / 1000, 0};
    setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);

    bool taken = false;
    if (connect(fd, reinterpret_cast<const sockaddr*>(&addr), sizeof addr) != 0) {
        const bool absent = errno == ENOENT || errno == ECONNREFUSED;
        std::fprintf(stderr, "%s: %s: %s (cannot connect to %s: %s)\n", PROGRAM, typed,
                     absent ? "vexorcd is not running" : "vexorcd is not taking connections",
                     CONTROL_SOCKET, std::strerror(errno));
    } else if (send(fd, &action, sizeof action, MSG_NOSIGNAL) != static_cast<ssize_t>(sizeof action)) {
        Fail("cannot send to vexorcd", typed);
    } else {
        // The daemon reads once and closes the connection: end of stream (or
        // a reset) is the proof that it took the action.
        pollfd pfd {fd, POLLIN, 0};
        int ready;
        do
            ready = poll(&pfd, 1, TAKE_TIMEOUT_MS);
        while (ready < 0 && errno == EINTR);
        char byte;
        const ssize_t got = ready == 1 ? recv(fd, &byte, 1, 0) : -1;
        if (got == 0 || (got < 0 && ready == 1 && errno == ECONNRESET))
            taken = true;
        else if (ready == 0)
            std::fprintf(stderr, "%s: %s: vexorcd has not taken the action within %d s; it may still act on it\n",
                         PROGRAM, typed, TAKE_TIMEOUT_MS / 1000);
        else if (got > 0)
            std::fprintf(stderr, "%s: %s: unexpected reply on %s\n", PROGRAM, typed, CONTROL_SOCKET);
        else
            Fail("no answer from vexorcd", typed);
    }
    close(fd);
    return taken;
}

int CmdSend(int argc, char** argv)
{
    if (argc < 1)
        return UsageError("no action given");
    // Every word is checked before anything is sent, so that a typo never
    // leaves half a sequence delivered.
    for (int i = 0; i < argc; ++i) {
        RcAction a;
        if (!ParseAction(argv[i], a)) {
            const char* digits = argv[i] + (argv[i][0] == '-' || argv[i][0] == '+');
            const bool numeric = std::isdigit(static_cast<unsigned char>(*digits)) != 0;
            return UsageError(numeric ? "not a 32-bit action code" : "unknown action", argv[i]);
        }
    }
    for (int i = 0; i < argc; ++i) {
        RcAction a = 0;
        ParseAction(argv[i], a);
        if (!SendOne(a, argv[i]))
            return EXIT_NOT_DELIVERED;
    }
    return EXIT_DELIVERED;
}

int CmdList(int argc, char**)
{
    if (argc > 0)
        return UsageError("list takes no arguments");
    char slug[NAME_MAX_LEN];
    for (RcAction a = RC_ACT_NONE; ActionSlug(a, slug); ++a)
        std::printf("%3" PRId32 "  %s\n", a, slug);
    return EXIT_DELIVERED;
}

int CmdHelp(int, char**)
{
    Usage(stdout);
    return EXIT_DELIVERED;
}

struct Command {
    const char* name;
    int (*run)(int argc, char** argv);  // the words after the command's name
    const char* args;
    const char* summary;
};

constexpr Command COMMANDS[] = {
    {"send", CmdSend, "ACTION...", "send actions to vexorcd, in order, one connection each"},
    {"list", CmdList, "", "list the action names with their codes"},
    {"help", CmdHelp, "", "show this text"},
};

// Options that stand for a command.
struct Alias {
    const char* option;
    const char* command;
};

constexpr Alias ALIASES[] = {{"--list", "list"}, {"-l", "list"}, {"--help", "help"}, {"-h", "help"}};

void Usage(std::FILE* out)
{
    std::fprintf(out,
                 "Usage: %s [send] ACTION...\n"
                 "       %s COMMAND [ARG...]\n"
                 "\n"
                 "Drives vexorcd, the remote controller daemon, through its control socket\n"
                 "%s.\n"
                 "\n"
                 "Commands:\n",
                 PROGRAM, PROGRAM, CONTROL_SOCKET);
    for (const Command& c : COMMANDS)
        std::fprintf(out, "  %-5s %-10s %s\n", c.name, c.args, c.summary);
    std::fprintf(out,
                 "Options --list (-l) and --help (-h) stand for the commands of those names.\n"
                 "\n"
                 "An ACTION is a name from the list (play, volume-up, custom3-held, ...; case\n"
                 "and '_' for '-' do not matter) or a code: decimal, or 0x and up to eight hex\n"
                 "digits for a raw 32-bit value. vexorcd acts only on codes 1 to 25. Each\n"
                 "action is sent on its own connection, and %s waits until vexorcd has\n"
                 "taken it (up to %d s) before sending the next. All actions are checked\n"
                 "before the first is sent.\n"
                 "\n"
                 "Exit status:\n"
                 "  0  every action was taken by vexorcd\n"
                 "  1  an action could not be delivered (vexorcd not running or not\n"
                 "     answering); the actions after it were not sent\n"
                 "  2  usage error: unknown command, action or option; nothing was sent\n",
                 PROGRAM, TAKE_TIMEOUT_MS / 1000);
}

}  // namespace

int main(int argc, char** argv)
{
    if (argc < 2) {
        Usage(stderr);
        return EXIT_USAGE;
    }
    const char* word = argv[1];
    for (const Alias& a : ALIASES)
        if (std::strcmp(word, a.option) == 0)
            word = a.command;
    for (const Command& c : COMMANDS)
        if (std::strcmp(word, c.name) == 0)
            return c.run(argc - 2, argv + 2);
    // No command named: the words are actions.
    if (word[0] == '-' && word[1] == '-')
        return UsageError("unknown option", word);
    return CmdSend(argc - 1, argv + 1);
}
