// vexorctl: the companion client of vexorcd, for the appliance's scripts and
// engineers. It sends remote actions to the daemon's control socket, each on
// its own connection, and waits until the daemon has taken each one. Its
// `audio` and `eq` commands talk to the audio daemon directly, through the
// daemon's own audio client, for the commands that vexorcd never sends
// itself: playlist records, equalizer bands and the rest of the catalogue.
//
// Commands are rows of one table; each handler gets the words after its name.
// Actions go through lib/action_send, the audio and equalizer commands live
// in ctl_audio and ctl_eq, the names people type in ctl_names.
#include <cinttypes>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <syslog.h>

#include "audioctl/playlist.hpp"
#include "common/actions.hpp"
#include "lib/action_send.hpp"
#include "vexorctl/ctl_audio.hpp"
#include "vexorctl/ctl_eq.hpp"
#include "vexorctl/ctl_names.hpp"
#include "vexorctl/ctl_out.hpp"

namespace {

void Usage(std::FILE* out);

// ---- Remote actions, through vexorcd --------------------------------------

// Sends one action and waits until the daemon has taken it; messages name
// the action as the user typed it.
bool SendOne(RcAction action, const char* typed)
{
    const ActionSendResult sent = ActionSend(action);
    switch (sent.status) {
    case ActionSendStatus::Taken:
        if (CtlVerbose)
            std::printf("%s: taken by vexorcd\n", typed);
        return true;
    case ActionSendStatus::NoSocket:
        CtlFail("cannot create a socket", typed, sent.error);
        break;
    case ActionSendStatus::NoTimeout:
        CtlFail("cannot set the time-out of the socket", typed, sent.error);
        break;
    case ActionSendStatus::NotRunning:
    case ActionSendStatus::NotAccepting:
        std::fprintf(stderr, "%s: %s: %s (cannot connect to %s: %s)\n", CTL_PROGRAM, typed,
                     sent.status == ActionSendStatus::NotRunning ? "vexorcd is not running"
                                                                 : "vexorcd is not taking connections",
                     RC_CTRL_SOCKET_PATH, std::strerror(sent.error));
        break;
    case ActionSendStatus::SendFailed:
        CtlFail("cannot send to vexorcd", typed, sent.error);
        break;
    case ActionSendStatus::TimedOut:
        std::fprintf(stderr, "%s: %s: vexorcd has not taken the action within %d s; it may still act on it\n",
                     CTL_PROGRAM, typed, ACTION_TAKE_TIMEOUT_MS / 1000);
        break;
    case ActionSendStatus::Replied:
        std::fprintf(stderr, "%s: %s: unexpected reply on %s\n", CTL_PROGRAM, typed, RC_CTRL_SOCKET_PATH);
        break;
    case ActionSendStatus::NoAnswer:
        CtlFail("no answer from vexorcd", typed, sent.error);
        break;
    }
    return false;
}

int CmdSend(int argc, char** argv)
{
    if (argc < 1)
        return CtlUsageError("no action given");
    // Every word is checked before anything is sent, so that a typo never
    // leaves half a sequence delivered.
    for (int i = 0; i < argc; ++i) {
        RcAction a;
        if (!CtlParseAction(argv[i], a))
            return CtlUsageError("%s '%s'", CtlLooksNumeric(argv[i]) ? "not a 32-bit action code" : "unknown action",
                                 argv[i]);
    }
    for (int i = 0; i < argc; ++i) {
        RcAction a = 0;
        CtlParseAction(argv[i], a);
        // Sent as asked: a program may probe the socket with it. But say so.
        if (!RcActionIsDispatchable(a))
            std::fprintf(stderr, "%s: %s: not an action (1 to %d); vexorcd takes it and ignores it\n",
                         CTL_PROGRAM, argv[i], static_cast<int>(RC_ACT_LAST));
        if (!SendOne(a, argv[i]))
            return CTL_EXIT_FAILED;
    }
    return CTL_EXIT_DONE;
}

int CmdList(int argc, char**)
{
    if (argc > 0)
        return CtlUsageError("list takes no arguments");
    char slug[CTL_NAME_MAX];
    for (RcAction a = RC_ACT_NONE; CtlActionName(a, slug); ++a)
        std::printf("%3" PRId32 "  %s\n", a, slug);
    return CTL_EXIT_DONE;
}

int CmdHelp(int, char**)
{
    Usage(stdout);
    return CTL_EXIT_DONE;
}

// ---- The command line ---------------------------------------------------------

struct Synopsis {
    const char* args;
    const char* summary;  // nullptr for an unused row
};

struct Command {
    const char* name;
    int (*run)(int argc, char** argv);  // the words after the command's name
    Synopsis forms[3];
};

constexpr Command COMMANDS[] = {
    {"send", CmdSend, {{"ACTION...", "send actions to vexorcd, in order, one connection each"}}},
    {"list", CmdList, {{"", "list the action names with their codes"}}},
    {"audio",
     CtlAudio,
     {{"CODE|NAME [ARG...]", "send one command straight to the audio daemon"},
      {"list", "list the audio commands with the arguments they take"}}},
    {"eq",
     CtlEq,
     {{"show", "print the value of the default equalizer profile"},
      {"set V1 ... V10", "send ten equalizer band values"},
      {"apply", "send the ten band values of the default profile"}}},
    {"help", CmdHelp, {{"", "show this text"}}},
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
                 "Usage: %s [-v] [send] ACTION...\n"
                 "       %s [-v] COMMAND [ARG...]\n"
                 "\n"
                 "Drives vexorcd, the remote controller daemon, through its control socket\n"
                 "%s, and sends the audio daemon on %s\n"
                 "the commands that vexorcd never sends itself.\n"
                 "\n"
                 "Commands:\n",
                 CTL_PROGRAM, CTL_PROGRAM, RC_CTRL_SOCKET_PATH, AUDIO_SOCKET_PATH);
    for (const Command& c : COMMANDS) {
        for (const Synopsis& s : c.forms) {
            if (s.summary == nullptr)
                continue;
            char head[64];
            std::snprintf(head, sizeof head, "%s %s", c.name, s.args);
            std::fprintf(out, "  %-25s %s\n", head, s.summary);
        }
    }
    std::fprintf(out,
                 "Options: -v (--verbose) prints a line for each command carried out;\n"
                 "--list (-l) and --help (-h) stand for the commands of those names.\n"
                 "\n"
                 "An ACTION is a name from the list (play, volume-up, custom3-held, ...; case\n"
                 "and '_' for '-' do not matter) or a code: decimal, or 0x and up to eight hex\n"
                 "digits for a raw 32-bit value. vexorcd acts only on codes 1 to 25. Each\n"
                 "action is sent on its own connection, and %s waits until vexorcd has\n"
                 "taken it (up to %d s) before sending the next. All actions are checked\n"
                 "before the first is sent.\n"
                 "\n"
                 "An audio command is named by its code or its name, with or without\n"
                 "%s (AUDIO_CMD_PLAY, play, custom-held; case and '_' for '-' do not\n"
                 "matter), and takes the arguments of its form ('audio list' shows them):\n"
                 "  none          no argument\n"
                 "  N             a decimal number within 32 signed bits\n"
                 "  FILE          a playlist record: a file of exactly %d bytes\n"
                 "  FILE N        a playlist record and N, stored into it at byte %d\n"
                 "  V1 ... V10    ten finite numbers (-2, 1.5, ...), sent with one decimal\n"
                 "Each command is one exchange with the audio daemon, which must answer\n"
                 "within half a second; it does not go through vexorcd.\n"
                 "\n"
                 "The default equalizer profile is named by %s in\n"
                 "%s when %s is \"yes\", and found\n"
                 "in %s, else in\n"
                 "%s. 'eq show' and 'eq apply' say why\n"
                 "when there is none: the equalizer is off, a key is not set, the profile is\n"
                 "in neither file, or a file could not be searched. 'eq apply' takes the\n"
                 "value as ten numbers separated by white space and refuses anything else.\n"
                 "\n"
                 "Exit status:\n"
                 "  0  done: every action taken by vexorcd, the audio command taken by the\n"
                 "     audio daemon, or the profile printed\n"
                 "  1  not done: vexorcd not running or not answering (the actions after it\n"
                 "     were not sent), the audio daemon did not take the command, the audio\n"
                 "     client refused its argument, or no usable default profile\n"
                 "  2  usage error: unknown command, action or option, or a bad argument (a\n"
                 "     number out of range, not ten band values, a record file that cannot\n"
                 "     be read or is not %d bytes); nothing was sent\n",
                 CTL_PROGRAM, ACTION_TAKE_TIMEOUT_MS / 1000, CTL_AUDIO_PREFIX, AUDIO_PLAYLIST_SIZE, AUDIO_PLAYLIST_N_OFFSET,
                 AUDIO_CONF_EQ_DEFAULT, VEXO_AUDIO_CONF_PATH, AUDIO_CONF_EQ_ENABLE, AUDIO_EQ_SYSTEM_FILE,
                 AUDIO_EQ_USER_FILE, AUDIO_PLAYLIST_SIZE);
}

int Run(int argc, char** argv)
{
    int first = 1;
    for (; first < argc; ++first) {
        if (std::strcmp(argv[first], "-v") == 0 || std::strcmp(argv[first], "--verbose") == 0)
            CtlVerbose = true;
        else
            break;
    }
    if (first == argc) {
        Usage(stderr);
        return CTL_EXIT_USAGE;
    }
    const char* word = argv[first];
    for (const Alias& a : ALIASES)
        if (std::strcmp(word, a.option) == 0)
            word = a.command;
    for (const Command& c : COMMANDS)
        if (std::strcmp(word, c.name) == 0)
            return c.run(argc - first - 1, argv + first + 1);
    // No command named: the words are actions.
    if (word[0] == '-' && word[1] == '-')
        return CtlUsageError("unknown option '%s'", word);
    return CmdSend(argc - first, argv + first);
}

}  // namespace

int main(int argc, char** argv)
{
    // The audio client logs its failures; whoever runs vexorctl sees them on
    // standard error too, also on a machine without a system logger.
    openlog(CTL_PROGRAM, LOG_PERROR, LOG_USER);
    int status = Run(argc, argv);
    // A script reading `eq show` must not take a cut value for the profile.
    if (std::fflush(stdout) != 0 || std::ferror(stdout) != 0) {
        std::fprintf(stderr, "%s: cannot write to standard output\n", CTL_PROGRAM);
        if (status == CTL_EXIT_DONE)
            status = CTL_EXIT_FAILED;
    }
    return status;
}
