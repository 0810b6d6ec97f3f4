// The playlist, shuffle and repeat commands of the audio daemon client, and
// the two forms that carry a playlist record.
#pragma once

#include <cstddef>
#include <cstdint>

#include "audioctl/ctrl.hpp"

inline constexpr std::int32_t AUDIO_CMD_20 = 20;
inline constexpr std::int32_t AUDIO_CMD_21 = 21;  // its decimal argument is 0 or more
inline constexpr std::int32_t AUDIO_CMD_22 = 22;
inline constexpr std::int32_t AUDIO_CMD_23 = 23;
inline constexpr std::int32_t AUDIO_CMD_24 = 24;
inline constexpr std::int32_t AUDIO_CMD_25 = 25;
inline constexpr std::int32_t AUDIO_CMD_TOGGLE_SHUFFLE = 26;
inline constexpr std::int32_t AUDIO_CMD_TOGGLE_REPEAT = 30;

// Size of a playlist record and the offset of the one field the client fills.
inline constexpr std::int32_t AUDIO_PLAYLIST_SIZE = 7872;
inline constexpr std::int32_t AUDIO_PLAYLIST_N_OFFSET = 6832;

// A playlist record supplied by the caller. The client defines only the
// integer at offset 6832, in the machine's byte order; every other byte is
// carried as it comes.
struct AudioPlaylistRecord {
    unsigned char head[AUDIO_PLAYLIST_N_OFFSET];
    std::int32_t n;
    unsigned char tail[AUDIO_PLAYLIST_SIZE - AUDIO_PLAYLIST_N_OFFSET - 4];
};
static_assert(sizeof(AudioPlaylistRecord) == AUDIO_PLAYLIST_SIZE);
static_assert(offsetof(AudioPlaylistRecord, n) == AUDIO_PLAYLIST_N_OFFSET);
static_assert(sizeof(AudioPlaylistRecord) <= sizeof(AudioCmdRecord::arg));

// Sends a command with a copy of record in its argument area. A missing
// record is refused (-1, nothing sent); else the exchange's result.
std::int32_t AudioCtrlSendRecord(std::int32_t code, const AudioPlaylistRecord* record);

// Stores n into record at offset 6832, then sends a copy of the record; the
// caller's record keeps n whatever the exchange's outcome. A missing record
// is refused (-1, nothing stored or sent); else the exchange's result.
std::int32_t AudioCtrlSendRecordInt(std::int32_t code, std::int32_t n,
                                    AudioPlaylistRecord* record);

// The least decimal argument a command takes: 0 for AUDIO_CMD_21, INT32_MIN
// (no limit) for every other command.
std::int32_t AudioPlaylistIntMin(std::int32_t code);

// Applies the refusal of the decimal playlist commands: logs and returns -1
// when code does not take n (n below AudioPlaylistIntMin), else 0.
std::int32_t AudioPlaylistCheckInt(std::int32_t code, std::int32_t n);
