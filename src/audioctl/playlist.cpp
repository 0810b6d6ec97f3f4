#include "audioctl/playlist.hpp"

#include <cstdint>
#include <cstring>

#include "common/log.hpp"

std::int32_t AudioPlaylistIntMin(std::int32_t code)
{
    return code == AUDIO_CMD_21 ? 0 : INT32_MIN;
}

std::int32_t AudioPlaylistCheckInt(std::int32_t code, std::int32_t n)
{
    if (n < AudioPlaylistIntMin(code)) {
        LogClientError(__FILE_NAME__, 55, "Bad parameter");
        return -1;
    }
    return 0;
}

std::int32_t AudioCtrlSendRecord(std::int32_t code, const AudioPlaylistRecord* record)
{
    if (record == nullptr) {
        LogClientError(__FILE_NAME__, 26, "Bad parameter");
        return -1;
    }
    // The copy fills all but the last 320 bytes of the argument area: zero
    // only those, not the whole 8 KiB first.
    AudioCmdRecord request;
    request.code = code;
    std::memcpy(request.arg, record, sizeof *record);
    std::memset(request.arg + sizeof *record, 0, sizeof request.arg - sizeof *record);
    return AudioCtrlDeliver(request);
}

std::int32_t AudioCtrlSendRecordInt(std::int32_t code, std::int32_t n, AudioPlaylistRecord* record)
{
    if (record == nullptr) {
        LogClientError(__FILE_NAME__, 105, "Bad parameter");
        return -1;
    }
    // The caller's record keeps n, whatever becomes of the exchange.
    record->n = n;
    return AudioCtrlSendRecord(code, record);
}
