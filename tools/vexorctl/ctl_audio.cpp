#include "vexorctl/ctl_audio.hpp"

#include <fcntl.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cinttypes>
#include <climits>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "audioctl/playlist.hpp"
#include "vexorctl/ctl_names.hpp"
#include "vexorctl/ctl_out.hpp"

namespace {

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

}  // namespace

bool CtlParseBands(int count, char* const* words, float (&bands)[AUDIO_EQ_BANDS], const char** bad)
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

namespace {

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
    if (CtlParseDecimal(text, code))
        return AudioCmdFind(code);
    for (int i = 0; const AudioCmdInfo* info = AudioCmdAt(i); ++i) {
        char full[CTL_NAME_MAX];
        char bare[CTL_NAME_MAX];
        CtlNameSlug(info->name, "", full);
        CtlNameSlug(info->name, CTL_AUDIO_PREFIX, bare);
        if (CtlNameMatches(text, full) || CtlNameMatches(text, bare))
            return info;
    }
    return nullptr;
}

// Reads a playlist record file of exactly 7872 bytes; anything else is
// explained on stderr and refused.
bool ReadRecordFile(const char* path, AudioPlaylistRecord& record)
{
    const int fd = open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
        std::fprintf(stderr, "%s: %s: cannot open the playlist record (%s)\n", CTL_PROGRAM, path,
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
        std::fprintf(stderr, "%s: %s: cannot read the playlist record (%s)\n", CTL_PROGRAM, path,
                     std::strerror(error));
        return false;
    }
    if (total > sizeof record) {
        std::fprintf(stderr, "%s: %s: a playlist record is %zu bytes; this file is longer\n", CTL_PROGRAM, path,
                     sizeof record);
        return false;
    }
    if (total < sizeof record) {
        std::fprintf(stderr, "%s: %s: a playlist record is %zu bytes; this file has %zu\n", CTL_PROGRAM, path,
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
        // The least decimal argument the audio client lets through, if any.
        char note[32] = "";
        const std::int32_t least = AudioPlaylistIntMin(info->code);
        if (least != INT32_MIN)
            std::snprintf(note, sizeof note, " (%" PRId32 " or more)", least);
        std::printf("%3" PRId32 "  %-24s  %-14s  %s%s\n", info->code, info->name, text.name, text.args, note);
    }
    return CTL_EXIT_DONE;
}

}  // namespace

int CtlAudioOutcome(std::int32_t code, std::int32_t result)
{
    const AudioCmdInfo* info = AudioCmdFind(code);
    const char* name = info != nullptr ? info->name : "?";
    if (result != 0) {
        std::fprintf(stderr, "%s: %s (%" PRId32 "): the audio daemon did not take the command\n",
                     CTL_PROGRAM, name, code);
        return CTL_EXIT_FAILED;
    }
    if (CtlVerbose)
        std::printf("%s (%" PRId32 "): taken by the audio daemon\n", name, code);
    return CTL_EXIT_DONE;
}

int CtlSendBands(const char* label, int argc, char** argv)
{
    float bands[AUDIO_EQ_BANDS];
    const char* bad = nullptr;
    if (!CtlParseBands(argc, argv, bands, &bad)) {
        if (bad == nullptr)
            return CtlUsageError("%s takes exactly %d band values, not %d", label, AUDIO_EQ_BANDS, argc);
        return CtlUsageError("%s: not a finite number '%s'", label, bad);
    }
    return CtlAudioOutcome(AUDIO_CMD_SET_EQ, AudioCtrlSetEqBands(bands));
}

int CtlAudio(int argc, char** argv)
{
    if (argc < 1)
        return CtlUsageError("audio: no command given");
    const char* word = argv[0];
    const bool list = std::strcmp(word, "list") == 0 || std::strcmp(word, "--list") == 0;
    if (list || std::strcmp(word, "-l") == 0) {
        if (argc > 1)
            return CtlUsageError("audio list takes no arguments");
        return CmdAudioList();
    }
    const AudioCmdInfo* cmd = ParseAudioCommand(word);
    if (cmd == nullptr)
        return CtlUsageError("%s '%s'", CtlLooksNumeric(word) ? "not an audio command code" : "unknown audio command",
                          word);
    const FormText& form = TextOf(cmd->form);
    const int count = argc - 1;
    char** args = argv + 1;
    if (count != form.words) {
        if (form.words == 0)
            return CtlUsageError("%s takes no argument", cmd->name);
        return CtlUsageError("%s takes %s", cmd->name, form.args);
    }

    std::int32_t n = 0;
    AudioPlaylistRecord record;
    switch (cmd->form) {
    case AudioArgForm::None:
        return CtlAudioOutcome(cmd->code, AudioCtrlSendBare(cmd->code));
    case AudioArgForm::Decimal:
        if (!CtlParseDecimal(args[0], n))
            return CtlUsageError("%s: not a 32-bit decimal number '%s'", cmd->name, args[0]);
        // A refused argument is not an exchange that failed: tell them apart.
        if (AudioPlaylistCheckInt(cmd->code, n) != 0) {
            std::fprintf(stderr, "%s: %s (%" PRId32 "): the audio client refuses the argument %" PRId32
                                 "; nothing was sent\n",
                         CTL_PROGRAM, cmd->name, cmd->code, n);
            return CTL_EXIT_FAILED;
        }
        return CtlAudioOutcome(cmd->code, AudioCtrlSendInt(cmd->code, n));
    case AudioArgForm::Record:
        if (!ReadRecordFile(args[0], record))
            return CTL_EXIT_USAGE;
        return CtlAudioOutcome(cmd->code, AudioCtrlSendRecord(cmd->code, &record));
    case AudioArgForm::RecordInt:
        if (!CtlParseDecimal(args[1], n))
            return CtlUsageError("%s: not a 32-bit decimal number '%s'", cmd->name, args[1]);
        if (!ReadRecordFile(args[0], record))
            return CTL_EXIT_USAGE;
        return CtlAudioOutcome(cmd->code, AudioCtrlSendRecordInt(cmd->code, n, &record));
    case AudioArgForm::Bands:
        return CtlSendBands(cmd->name, count, args);
    }
    return CTL_EXIT_USAGE;
}

