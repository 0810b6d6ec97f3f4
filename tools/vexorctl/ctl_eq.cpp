#include "vexorctl/ctl_eq.hpp"

#include <fcntl.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>

#include "audioctl/ctrl.hpp"
#include "vexorctl/ctl_audio.hpp"
#include "vexorctl/ctl_out.hpp"
#include "vlibc/audioconf.hpp"

namespace {

// A profile value fits the lines of the profile files.
constexpr int PROFILE_VALUE_SIZE = 1024;

// Reads a configuration key for a message; when it cannot be read, says so
// after head and returns false.
bool ConfValue(const char* key, char (&value)[VEXO_AUDIO_CONF_VALUE_MAX], const char* head)
{
    const int got = VEXOAudioConfGet(key, value, VEXO_AUDIO_CONF_VALUE_MAX);
    if (got >= 1)
        return true;
    std::fprintf(stderr, "%s: %s: %s %s %s\n", CTL_PROGRAM, head, key,
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
        std::fprintf(stderr, "%s: the equalizer is off: %s is \"%s\", not \"yes\"\n", CTL_PROGRAM,
                     AUDIO_CONF_EQ_ENABLE, enabled);
        return;
    }
    char name[VEXO_AUDIO_CONF_VALUE_MAX];
    if (!ConfValue(AUDIO_CONF_EQ_DEFAULT, name, "no default equalizer profile"))
        return;
    std::fprintf(stderr, "%s: the equalizer profile \"%s\" is in neither %s nor %s\n", CTL_PROGRAM, name,
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
        std::fprintf(stderr, "%s: %s: %s: %s\n", CTL_PROGRAM, head, AUDIO_EQ_SYSTEM_FILE,
                     std::strerror(errno));
    else if (!Openable(AUDIO_EQ_USER_FILE))
        std::fprintf(stderr,
                     "%s: %s: %s: %s, and the profile is not in %s or that file holds a line "
                     "without ':'\n",
                     CTL_PROGRAM, head, AUDIO_EQ_USER_FILE, std::strerror(errno), AUDIO_EQ_SYSTEM_FILE);
    else
        std::fprintf(stderr, "%s: %s: a profile file holds a line without ':'\n", CTL_PROGRAM, head);
}

// The default profile for `eq show` and `eq apply`, which take no arguments:
// CTL_EXIT_DONE with its value as the audio client resolves it, else the exit
// status, with the reason on stderr.
int DefaultProfile(int argc, const char* command, char (&value)[PROFILE_VALUE_SIZE])
{
    if (argc > 0)
        return CtlUsageError("eq %s takes no arguments", command);
    const std::int32_t found = AudioEqGetDefault(value, PROFILE_VALUE_SIZE);
    if (found == 1)
        return CTL_EXIT_DONE;
    if (found < 0)
        ExplainSearchFailure();
    else
        ExplainNoProfile();
    return CTL_EXIT_FAILED;
}

int EqShow(int argc, char**)
{
    char value[PROFILE_VALUE_SIZE];
    const int status = DefaultProfile(argc, "show", value);
    if (status == CTL_EXIT_DONE)
        std::printf("%s\n", value);
    return status;
}

int EqSet(int argc, char** argv)
{
    return CtlSendBands("eq set", argc, argv);
}

// A profile's value is applied when it is ten numbers separated by white
// space ("0 1.5 -2 12 0 0 0 0 -1 -1"), each as `eq set` takes it.
int EqApply(int argc, char**)
{
    char value[PROFILE_VALUE_SIZE];
    const int status = DefaultProfile(argc, "apply", value);
    if (status != CTL_EXIT_DONE)
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
    if (!CtlParseBands(count, word, bands, &bad)) {
        std::fprintf(stderr,
                     "%s: the default equalizer profile \"%s\" is not ten numbers separated by white "
                     "space; nothing was sent\n",
                     CTL_PROGRAM, value);
        return CTL_EXIT_FAILED;
    }
    return CtlAudioOutcome(AUDIO_CMD_SET_EQ, AudioCtrlSetEqBands(bands));
}

struct SubCommand {
    const char* name;
    int (*run)(int argc, char** argv);
};

constexpr SubCommand EQ_COMMANDS[] = {{"show", EqShow}, {"set", EqSet}, {"apply", EqApply}};

}  // namespace

int CtlEq(int argc, char** argv)
{
    if (argc < 1)
        return CtlUsageError("eq: show, set or apply?");
    for (const SubCommand& s : EQ_COMMANDS)
        if (std::strcmp(argv[0], s.name) == 0)
            return s.run(argc - 1, argv + 1);
    return CtlUsageError("unknown eq command '%s'", argv[0]);
}
