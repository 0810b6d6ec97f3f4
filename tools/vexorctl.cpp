// vexorctl: the companion client of vexorcd, for the appliance's scripts and
// engineers. It sends remote actions to the daemon's control socket, each on
// its own connection, and waits until the daemon has taken each one. Its
// `audio` and `eq` commands talk to the audio daemon directly, through the
// daemon's own audio client, for the commands that vexorcd never sends
// itself: playlist records, equalizer bands and the rest of the catalogue.
//
// Commands are rows of one table; each handler gets the words after its name.
#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cinttypes>
#include <climits>
#include <cmath>
#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "audioctl/ctrl.hpp"
#include "audioctl/playlist.hpp"
#include "common/rc_types.hpp"
#include "common/actions.hpp"
#include "vlibc/audioconf.hpp"

namespace {

constexpr char PROGRAM[] = "vexorctl";
constexpr char CONTROL_SOCKET[] = "/tmp/vexoctrl";

// How long the daemon may take to accept a connection and to read its
// action: one poll of the receiver plus one audio exchange take well under a
// second, so this only ends a wait on a daemon that has stopped serving.
constexpr int TAKE_TIMEOUT_MS = 5000;

// Exit statuses, as the usage text documents them.
constexpr int EXIT_DONE = 0;
constexpr int EXIT_FAILED = 1;
constexpr int EXIT_USAGE = 2;

// -v: one line on standard output for each command carried out.
bool verbose = false;

// Longest user-facing name: "audio-cmd-toggle-shuffle" and the like.
constexpr std::size_t NAME_MAX_LEN = 32;

// A profile value fits the lines of the profile files.
constexpr int PROFILE_VALUE_SIZE = 1024;

// Case and '_' versus '-' do not matter in names typed by people.
char Fold(char c)
{
    return c == '_' ? '-' : static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
}

// The user-facing name of a constant: without its prefix, folded
// ("RC_ACT_VOLUME_UP" -> "volume-up").
void Slug(const char* name, const char* prefix, char (&out)[NAME_MAX_LEN])
{
    const std::size_t skip = std::strlen(prefix);
    if (std::strncmp(name, prefix, skip) == 0)
        name += skip;
    std::size_t i = 0;
    for (; name[i] != '\0' && i + 1 < sizeof out; ++i)
        out[i] = Fold(name[i]);
    out[i] = '\0';
}

// The user-facing name of an action; false for values without a name.
bool ActionSlug(RcAction action, char (&out)[NAME_MAX_LEN])
{
    const char* name = RcActionName(action);
    if (name == nullptr)
        return false;
    Slug(name, "RC_ACT_", out);
    return true;
}

// Whether a typed name, folded, is the slug.
bool SameName(const char* typed, const char* slug)
{
    for (; *typed != '\0' && *slug != '\0'; ++typed, ++slug)
        if (Fold(*typed) != *slug)
            return false;
    return *typed == *slug;
}

// Whether a word was meant as a number: digits after an optional sign.
bool LooksNumeric(const char* text)
{
    const char* digits = text + (text[0] == '-' || text[0] == '+');
    return std::isdigit(static_cast<unsigned char>(*digits)) != 0;
}

// A signed 32-bit decimal number, with nothing before or after it.
bool ParseDecimal(const char* text, std::int32_t& out)
{
    if (*text == '\0' || std::isspace(static_cast<unsigned char>(*text)))
        return false;
    char* end = nullptr;
    errno = 0;
    const long long v = std::strtoll(text, &end, 10);
    if (errno != 0 || *end != '\0' || v < INT32_MIN || v > INT32_MAX)
        return false;
    out = static_cast<std::int32_t>(v);
    return true;
}

// A decimal code, or a hexadecimal bit pattern "0x..." of up to 32 bits.
bool ParseNumber(const char* text, RcAction& out)
{
    if (text[0] != '0' || (text[1] != 'x' && text[1] != 'X'))
        return ParseDecimal(text, out);
    const char* hex = text + 2;
    if (!std::isxdigit(static_cast<unsigned char>(*hex)))
        return false;
    char* end = nullptr;
    errno = 0;
    const unsigned long long v = std::strtoull(hex, &end, 16);
    if (errno != 0 || *end != '\0' || v > UINT32_MAX)
        return false;
    const std::uint32_t bits = static_cast<std::uint32_t>(v);
    std::memcpy(&out, &bits, sizeof out);
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

// A band value: a finite number, with nothing before or after it.
bool ParseBand(const char* text, float& out)
{
    if (*text == '\0' || std::isspace(static_cast<unsigned char>(*text)))
        return false;
    char* end = nullptr;
    const float v = std::strtof(text, &end);
    if (*end != '\0' || !std::isfinite(v))
        return false;
    out = v;
    return true;
}

// Ten band values from ten words. Otherwise false, with *bad at the first
// word that is not a finite number (nullptr when the count is wrong).
bool ParseBands(int count, char* const* words, float (&bands)[AUDIO_EQ_BANDS], const char** bad)
{
    *bad = nullptr;
    if (count != AUDIO_EQ_BANDS)
        return false;
    for (int i = 0; i < AUDIO_EQ_BANDS; ++i) {
        if (!ParseBand(words[i], bands[i])) {
            *bad = words[i];
            return false;
        }
    }
    return true;
}

void Usage(std::FILE* out);

// Reports a usage error; returns the usage exit status.
__attribute__((format(printf, 1, 2))) int UsageError(const char* fmt, ...)
{
    std::fprintf(stderr, "%s: ", PROGRAM);
    std::va_list ap;
    va_start(ap, fmt);
    std::vfprintf(stderr, fmt, ap);
    va_end(ap);
    std::fprintf(stderr, "\nTry '%s --help' or '%s --list'.\n", PROGRAM, PROGRAM);
    return EXIT_USAGE;
}

void Fail(const char* what, const char* action)
{
    std::fprintf(stderr, "%s: %s: %s (%s)\n", PROGRAM, action, what, std::strerror(errno));
}

// ---- Remote actions, through vexorcd --------------------------------------

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
    if (taken && verbose)
        std::printf("%s: taken by vexorcd\n", typed);
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
        if (!ParseAction(argv[i], a))
            return UsageError("%s '%s'",
                              LooksNumeric(argv[i]) ? "not a 32-bit action code" : "unknown action", argv[i]);
    }
    for (int i = 0; i < argc; ++i) {
        RcAction a = 0;
        ParseAction(argv[i], a);
        if (!SendOne(a, argv[i]))
            return EXIT_FAILED;
    }
    return EXIT_DONE;
}

int CmdList(int argc, char**)
{
    if (argc > 0)
        return UsageError("list takes no arguments");
    char slug[NAME_MAX_LEN];
    for (RcAction a = RC_ACT_NONE; ActionSlug(a, slug); ++a)
        std::printf("%3" PRId32 "  %s\n", a, slug);
    return EXIT_DONE;
}

// ---- Audio commands, straight to the audio daemon ---------------------------

constexpr char AUDIO_PREFIX[] = "AUDIO_CMD_";

// How each argument form is typed on the command line.
struct FormText {
    AudioArgForm form;
    const char* name;
    const char* args;
    int words;
};

constexpr FormText FORM_TEXTS[] = {
    {AudioArgForm::None, "none", "", 0},
    {AudioArgForm::Decimal, "decimal", "N", 1},
    {AudioArgForm::Record, "record", "FILE", 1},
    {AudioArgForm::RecordInt, "record+integer", "FILE N", 2},
    {AudioArgForm::Bands, "bands", "V1 ... V10", AUDIO_EQ_BANDS},
};

const FormText& TextOf(AudioArgForm form)
{
    for (const FormText& t : FORM_TEXTS)
        if (t.form == form)
            return t;
    return FORM_TEXTS[0];
}

// A catalogue command by code, or by its constant's name with or without
// "AUDIO_CMD_" (AUDIO_CMD_PLAY, play, Custom_Held, audio-cmd-8).
const AudioCmdInfo* ParseAudioCommand(const char* text)
{
    std::int32_t code;
    if (ParseDecimal(text, code))
        return AudioCmdFind(code);
    for (int i = 0; const AudioCmdInfo* info = AudioCmdAt(i); ++i) {
        char full[NAME_MAX_LEN];
        char bare[NAME_MAX_LEN];
        Slug(info->name, "", full);
        Slug(info->name, AUDIO_PREFIX, bare);
        if (SameName(text, full) || SameName(text, bare))
            return info;
    }
    return nullptr;
}

// Reports the outcome of one exchange with the audio daemon.
int AudioOutcome(std::int32_t code, std::int32_t result)
{
    const AudioCmdInfo* info = AudioCmdFind(code);
    const char* name = info != nullptr ? info->name : "?";
    if (result != 0) {
        std::fprintf(stderr, "%s: %s (%" PRId32 "): the audio daemon did not take the command (see syslog)\n",
                     PROGRAM, name, code);
        return EXIT_FAILED;
    }
    if (verbose)
        std::printf("%s (%" PRId32 "): taken by the audio daemon\n", name, code);
    return EXIT_DONE;
}

// Sends ten band values typed on the command line; label names the command
// in messages.
int SendBands(const char* label, int argc, char** argv)
{
    float bands[AUDIO_EQ_BANDS];
    const char* bad = nullptr;
    if (!ParseBands(argc, argv, bands, &bad)) {
        if (bad == nullptr)
            return UsageError("%s takes exactly %d band values, not %d", label, AUDIO_EQ_BANDS, argc);
        return UsageError("%s: not a finite number '%s'", label, bad);
    }
    return AudioOutcome(AUDIO_CMD_SET_EQ, AudioCtrlSetEqBands(bands));
}

// Reads a playlist record file of exactly 7872 bytes; anything else is
// explained on stderr and refused.
bool ReadRecordFile(const char* path, AudioPlaylistRecord& record)
{
    const int fd = open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
        std::fprintf(stderr, "%s: %s: cannot open the playlist record (%s)\n", PROGRAM, path,
                     std::strerror(errno));
        return false;
    }
    // One byte more than a record: a longer file shows itself.
    unsigned char bytes[AUDIO_PLAYLIST_SIZE + 1];
    std::size_t total = 0;
    int error = 0;
    while (total < sizeof bytes) {
        const ssize_t got = read(fd, bytes + total, sizeof bytes - total);
        if (got < 0 && errno == EINTR)
            continue;
        if (got < 0)
            error = errno;
        if (got <= 0)
            break;
        total += static_cast<std::size_t>(got);
    }
    close(fd);
    if (error != 0) {
        std::fprintf(stderr, "%s: %s: cannot read the playlist record (%s)\n", PROGRAM, path,
                     std::strerror(error));
        return false;
    }
    if (total > sizeof record) {
        std::fprintf(stderr, "%s: %s: a playlist record is %zu bytes; this file is longer\n", PROGRAM, path,
                     sizeof record);
        return false;
    }
    if (total < sizeof record) {
        std::fprintf(stderr, "%s: %s: a playlist record is %zu bytes; this file has %zu\n", PROGRAM, path,
                     sizeof record, total);
        return false;
    }
    std::memcpy(&record, bytes, sizeof record);
    return true;
}

int CmdAudioList()
{
    for (int i = 0; const AudioCmdInfo* info = AudioCmdAt(i); ++i) {
        const FormText& text = TextOf(info->form);
        if (text.words == 0) {
            std::printf("%3" PRId32 "  %-24s  %s\n", info->code, info->name, text.name);
            continue;
        }
        // Its decimal argument is the one the audio client checks.
        const char* note = info->code == AUDIO_CMD_21 ? " (0 or more)" : "";
        std::printf("%3" PRId32 "  %-24s  %-14s  %s%s\n", info->code, info->name, text.name, text.args, note);
    }
    return EXIT_DONE;
}

int CmdAudio(int argc, char** argv)
{
    if (argc < 1)
        return UsageError("audio: no command given");
    const char* word = argv[0];
    const bool list = std::strcmp(word, "list") == 0 || std::strcmp(word, "--list") == 0;
    if (list || std::strcmp(word, "-l") == 0) {
        if (argc > 1)
            return UsageError("audio list takes no arguments");
        return CmdAudioList();
    }
    const AudioCmdInfo* cmd = ParseAudioCommand(word);
    if (cmd == nullptr)
        return UsageError("%s '%s'", LooksNumeric(word) ? "not an audio command code" : "unknown audio command",
                          word);
    const FormText& form = TextOf(cmd->form);
    const int count = argc - 1;
    char** args = argv + 1;
    if (count != form.words) {
        if (form.words == 0)
            return UsageError("%s takes no argument", cmd->name);
        return UsageError("%s takes %s", cmd->name, form.args);
    }

    std::int32_t n = 0;
    AudioPlaylistRecord record;
    switch (cmd->form) {
    case AudioArgForm::None:
        return AudioOutcome(cmd->code, AudioCtrlSendBare(cmd->code));
    case AudioArgForm::Decimal:
        if (!ParseDecimal(args[0], n))
            return UsageError("%s: not a 32-bit decimal number '%s'", cmd->name, args[0]);
        // A refused argument is not an exchange that failed: tell them apart.
        if (AudioPlaylistCheckInt(cmd->code, n) != 0) {
            std::fprintf(stderr, "%s: %s (%" PRId32 "): the audio client refuses the argument %" PRId32
                                 "; nothing was sent (see syslog)\n",
                         PROGRAM, cmd->name, cmd->code, n);
            return EXIT_FAILED;
        }
        return AudioOutcome(cmd->code, AudioCtrlSendInt(cmd->code, n));
    case AudioArgForm::Record:
        if (!ReadRecordFile(args[0], record))
            return EXIT_USAGE;
        return AudioOutcome(cmd->code, AudioCtrlSendRecord(cmd->code, &record));
    case AudioArgForm::RecordInt:
        if (!ParseDecimal(args[1], n))
            return UsageError("%s: not a 32-bit decimal number '%s'", cmd->name, args[1]);
        if (!ReadRecordFile(args[0], record))
            return EXIT_USAGE;
        return AudioOutcome(cmd->code, AudioCtrlSendRecordInt(cmd->code, n, &record));
    case AudioArgForm::Bands:
        return SendBands(cmd->name, count, args);
    }
    return EXIT_USAGE;
}

// ---- Equalizer ----------------------------------------------------------------

// Reads a configuration key for a message; when it cannot be read, says so
// after head and returns false.
bool ConfValue(const char* key, char (&value)[VEXO_AUDIO_CONF_VALUE_MAX], const char* head)
{
    const int got = VEXOAudioConfGet(key, value, VEXO_AUDIO_CONF_VALUE_MAX);
    if (got >= 1)
        return true;
    std::fprintf(stderr, "%s: %s: %s %s %s\n", PROGRAM, head, key,
                 got == 0 ? "is not set in" : "cannot be read from", VEXO_AUDIO_CONF_PATH);
    return false;
}

// Why the audio client found no default profile, read again from the
// configuration for the message only. The wordings:
//   the equalizer is off: audio_enable_equalizer is not set in <conf>
//   the equalizer is off: audio_enable_equalizer cannot be read from <conf>
//   the equalizer is off: audio_enable_equalizer is "<value>", not "yes"
//   no default equalizer profile: audio_default_equalizer is not set in <conf>
//   the equalizer profile "<name>" is in neither <system file> nor <user file>
void ExplainNoProfile()
{
    char enabled[VEXO_AUDIO_CONF_VALUE_MAX];
    if (!ConfValue(AUDIO_CONF_EQ_ENABLE, enabled, "the equalizer is off"))
        return;
    if (std::strcmp(enabled, "yes") != 0) {
        std::fprintf(stderr, "%s: the equalizer is off: %s is \"%s\", not \"yes\"\n", PROGRAM,
                     AUDIO_CONF_EQ_ENABLE, enabled);
        return;
    }
    char name[VEXO_AUDIO_CONF_VALUE_MAX];
    if (!ConfValue(AUDIO_CONF_EQ_DEFAULT, name, "no default equalizer profile"))
        return;
    std::fprintf(stderr, "%s: the equalizer profile \"%s\" is in neither %s nor %s\n", PROGRAM, name,
                 AUDIO_EQ_SYSTEM_FILE, AUDIO_EQ_USER_FILE);
}

// Whether a profile file can be opened; errno tells why not.
bool Openable(const char* path)
{
    const int fd = open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0)
        return false;
    close(fd);
    return true;
}

// Why the search of the profile files failed, as far as can be told without
// searching again; the audio client has logged what it met.
void ExplainSearchFailure()
{
    const char* head = "cannot search the equalizer profiles";
    if (!Openable(AUDIO_EQ_SYSTEM_FILE))
        std::fprintf(stderr, "%s: %s: %s: %s (see syslog)\n", PROGRAM, head, AUDIO_EQ_SYSTEM_FILE,
                     std::strerror(errno));
    else if (!Openable(AUDIO_EQ_USER_FILE))
        std::fprintf(stderr,
                     "%s: %s: %s: %s, and the profile is not in %s or that file holds a line "
                     "without ':' (see syslog)\n",
                     PROGRAM, head, AUDIO_EQ_USER_FILE, std::strerror(errno), AUDIO_EQ_SYSTEM_FILE);
    else
        std::fprintf(stderr, "%s: %s: a profile file holds a line without ':' (see syslog)\n", PROGRAM, head);
}

// The default profile for `eq show` and `eq apply`, which take no arguments:
// EXIT_DONE with its value as the audio client resolves it, else the exit
// status, with the reason on stderr.
int DefaultProfile(int argc, const char* command, char (&value)[PROFILE_VALUE_SIZE])
{
    if (argc > 0)
        return UsageError("eq %s takes no arguments", command);
    const std::int32_t found = AudioEqGetDefault(value, PROFILE_VALUE_SIZE);
    if (found == 1)
        return EXIT_DONE;
    if (found < 0)
        ExplainSearchFailure();
    else
        ExplainNoProfile();
    return EXIT_FAILED;
}

int EqShow(int argc, char**)
{
    char value[PROFILE_VALUE_SIZE];
    const int status = DefaultProfile(argc, "show", value);
    if (status == EXIT_DONE)
        std::printf("%s\n", value);
    return status;
}

int EqSet(int argc, char** argv)
{
    return SendBands("eq set", argc, argv);
}

// A profile's value is applied when it is ten numbers separated by white
// space ("0 1.5 -2 12 0 0 0 0 -1 -1"), each as `eq set` takes it.
int EqApply(int argc, char**)
{
    char value[PROFILE_VALUE_SIZE];
    const int status = DefaultProfile(argc, "apply", value);
    if (status != EXIT_DONE)
        return status;
    char words[PROFILE_VALUE_SIZE];
    std::memcpy(words, value, std::strlen(value) + 1);
    // Split in place; one word more than needed shows that there are too many.
    char* word[AUDIO_EQ_BANDS + 1];
    int count = 0;
    for (char* p = words; *p != '\0' && count < AUDIO_EQ_BANDS + 1;) {
        while (std::isspace(static_cast<unsigned char>(*p)))
            *p++ = '\0';
        if (*p == '\0')
            break;
        word[count++] = p;
        while (*p != '\0' && !std::isspace(static_cast<unsigned char>(*p)))
            ++p;
    }
    float bands[AUDIO_EQ_BANDS];
    const char* bad = nullptr;
    if (!ParseBands(count, word, bands, &bad)) {
        std::fprintf(stderr,
                     "%s: the default equalizer profile \"%s\" is not ten numbers separated by white "
                     "space; nothing was sent\n",
                     PROGRAM, value);
        return EXIT_FAILED;
    }
    return AudioOutcome(AUDIO_CMD_SET_EQ, AudioCtrlSetEqBands(bands));
}

struct SubCommand {
    const char* name;
    int (*run)(int argc, char** argv);
};

constexpr SubCommand EQ_COMMANDS[] = {{"show", EqShow}, {"set", EqSet}, {"apply", EqApply}};

int CmdEq(int argc, char** argv)
{
    if (argc < 1)
        return UsageError("eq: show, set or apply?");
    for (const SubCommand& s : EQ_COMMANDS)
        if (std::strcmp(argv[0], s.name) == 0)
            return s.run(argc - 1, argv + 1);
    return UsageError("unknown eq command '%s'", argv[0]);
}

int CmdHelp(int, char**)
{
    Usage(stdout);
    return EXIT_DONE;
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
     CmdAudio,
     {{"CODE|NAME [ARG...]", "send one command straight to the audio daemon"},
      {"list", "list the audio commands with the arguments they take"}}},
    {"eq",
     CmdEq,
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
                 PROGRAM, PROGRAM, CONTROL_SOCKET, AUDIO_SOCKET_PATH);
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
                 PROGRAM, TAKE_TIMEOUT_MS / 1000, AUDIO_PREFIX, AUDIO_PLAYLIST_SIZE, AUDIO_PLAYLIST_N_OFFSET,
                 AUDIO_CONF_EQ_DEFAULT, VEXO_AUDIO_CONF_PATH, AUDIO_CONF_EQ_ENABLE, AUDIO_EQ_SYSTEM_FILE,
                 AUDIO_EQ_USER_FILE, AUDIO_PLAYLIST_SIZE);
}

int Run(int argc, char** argv)
{
    int first = 1;
    for (; first < argc; ++first) {
        if (std::strcmp(argv[first], "-v") == 0 || std::strcmp(argv[first], "--verbose") == 0)
            verbose = true;
        else
            break;
    }
    if (first == argc) {
        Usage(stderr);
        return EXIT_USAGE;
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
        return UsageError("unknown option '%s'", word);
    return CmdSend(argc - first, argv + first);
}

}  // namespace

int main(int argc, char** argv)
{
    int status = Run(argc, argv);
    // A script reading `eq show` must not take a cut value for the profile.
    if (std::fflush(stdout) != 0 || std::ferror(stdout) != 0) {
        std::fprintf(stderr, "%s: cannot write to standard output\n", PROGRAM);
        if (status == EXIT_DONE)
            status = EXIT_FAILED;
    }
    return status;
}
