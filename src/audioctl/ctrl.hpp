// The audio daemon client: the command record, the one exchange that
// delivers it, the command catalogue and the equalizer profile.
//
// Every command travels as one fixed 8196-byte record on its own connection to
// the audio daemon's socket (AUDIO_SOCKET_PATH); it answers with at least one byte.
// The connect is bounded by 500 ms, and the two waits of an exchange (for
// writability, then for the reply) share a second budget of 500 ms: one
// exchange takes at most about a second, signals or not.
#pragma once

#include <cstddef>
#include <cstdint>

#include "common/paths.hpp"

// Size of the argument area of a command record, and of every reply buffer
// the client offers.
inline constexpr std::int32_t AUDIO_ARG_SIZE = 8192;
inline constexpr std::int32_t AUDIO_REPLY_SIZE = 8192;

// The time budget of the connect, and that of the two waits, in microseconds.
inline constexpr std::int64_t AUDIO_BUDGET_US = 500000;

// The request: the command code in the machine's byte order, then the
// argument area; every byte the argument does not use is zero.
struct AudioCmdRecord {
    std::int32_t code;
    char arg[AUDIO_ARG_SIZE];
};
static_assert(sizeof(AudioCmdRecord) == 8196);
static_assert(offsetof(AudioCmdRecord, code) == 0);
static_assert(offsetof(AudioCmdRecord, arg) == 4);

// Command codes of the module ctrl. The playlist, shuffle and repeat codes
// (20 to 26 and 30) are in audioctl/playlist.hpp.
inline constexpr std::int32_t AUDIO_CMD_RANDOM100 = 1;
inline constexpr std::int32_t AUDIO_CMD_RADIO = 2;
inline constexpr std::int32_t AUDIO_CMD_IPOD = 3;
inline constexpr std::int32_t AUDIO_CMD_PLAY = 4;
inline constexpr std::int32_t AUDIO_CMD_STOP = 5;
inline constexpr std::int32_t AUDIO_CMD_NEXT = 6;
inline constexpr std::int32_t AUDIO_CMD_PREV = 7;
inline constexpr std::int32_t AUDIO_CMD_8 = 8;
inline constexpr std::int32_t AUDIO_CMD_9 = 9;
inline constexpr std::int32_t AUDIO_CMD_10 = 10;
inline constexpr std::int32_t AUDIO_CMD_11 = 11;
inline constexpr std::int32_t AUDIO_CMD_VOLUME_UP = 12;
inline constexpr std::int32_t AUDIO_CMD_VOLUME_DOWN = 13;
inline constexpr std::int32_t AUDIO_CMD_28 = 28;
inline constexpr std::int32_t AUDIO_CMD_29 = 29;
inline constexpr std::int32_t AUDIO_CMD_PLAYLIST = 31;
inline constexpr std::int32_t AUDIO_CMD_CUSTOM = 32;
inline constexpr std::int32_t AUDIO_CMD_NEXT_HELD = 33;
inline constexpr std::int32_t AUDIO_CMD_PREV_HELD = 34;
inline constexpr std::int32_t AUDIO_CMD_SET_EQ = 35;
inline constexpr std::int32_t AUDIO_CMD_CUSTOM_HELD = 36;

// How a command carries its argument in the argument area.
enum class AudioArgForm : std::uint8_t {
    None,       // all 8192 bytes zero
    Decimal,    // a signed 32-bit integer as "%d" writes it, then a zero byte
    Record,     // the 7872 bytes of a playlist record
    RecordInt,  // a playlist record after an integer was stored at its offset 6832
    Bands,      // ten equalizer band values as text
};

// One row of the command catalogue.
struct AudioCmdInfo {
    std::int32_t code;
    const char* name;  // "AUDIO_CMD_PLAY"
    AudioArgForm form;
};

// Number of commands in the catalogue.
inline constexpr int AUDIO_CMD_COUNT = 29;

// Returns the catalogue row of a code, or nullptr for a code not in it.
const AudioCmdInfo* AudioCmdFind(std::int32_t code);

// Returns the catalogue row with this exact name, or nullptr.
const AudioCmdInfo* AudioCmdFindName(const char* name);

// Returns the index-th row in code order (0..AUDIO_CMD_COUNT-1), or nullptr.
const AudioCmdInfo* AudioCmdAt(int index);

// One exchange: connect, send the 8196 bytes of request, wait for and read
// the reply once into reply (cleared over replyCapacity bytes first), close.
// 0 when the whole record went out and at least one byte came back, else -1.
std::int32_t AudioCtrlTransact(const AudioCmdRecord& request, char* reply,
                               std::int32_t replyCapacity);

// Delivers a built record with an 8192-byte reply buffer and drops the reply;
// returns the exchange's result.
std::int32_t AudioCtrlDeliver(const AudioCmdRecord& request);

// Sends a command without argument; returns the exchange's result.
std::int32_t AudioCtrlSendBare(std::int32_t code);

// Sends a command with n in decimal; -1 without sending when the command
// refuses n, else the exchange's result.
std::int32_t AudioCtrlSendInt(std::int32_t code, std::int32_t n);

// ---- Equalizer profile --------------------------------------------------

// The audio configuration keys of the equalizer.
inline constexpr char AUDIO_CONF_EQ_ENABLE[] = "audio_enable_equalizer";
inline constexpr char AUDIO_CONF_EQ_DEFAULT[] = "audio_default_equalizer";

// Number of band values of the equalizer command.
inline constexpr int AUDIO_EQ_BANDS = 10;

// Searches a profile file for the first line whose name (the text before the
// line's last ':') is name or a prefix of it, and copies its trimmed value
// into out. 1 on a match, 0 when no line matches, -1 on failure (file not
// opened, a line without ':', trimming failed). out is written only on a match.
std::int32_t AudioEqLookupProfile(const char* path, const char* name, char* out,
                                  std::int32_t outSize);

// Resolves the configured default profile from the system file, then the user
// file. 1 when out holds its value; 0 when the equalizer is off, a key cannot
// be read or no file has the profile; -1 when a file search failed.
std::int32_t AudioEqGetDefault(char* out, std::int32_t outSize);

// Sends the ten band values as AUDIO_CMD_SET_EQ; returns the exchange's result.
std::int32_t AudioCtrlSetEqBands(const float (&bands)[AUDIO_EQ_BANDS]);
