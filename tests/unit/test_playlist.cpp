// The playlist commands: the caller's record and the refusals. The bytes on
// the wire of both record forms are pinned down by vexorctl's end-to-end test.
#include <cstring>

#include <gtest/gtest.h>

#include "audio_peer.hpp"
#include "audioctl/playlist.hpp"
#include "harness.hpp"

namespace {

// A record whose every byte differs from zero and from its neighbours.
AudioPlaylistRecord Pattern()
{
    AudioPlaylistRecord record;
    auto* bytes = reinterpret_cast<unsigned char*>(&record);
    for (std::size_t i = 0; i < sizeof record; ++i)
        bytes[i] = static_cast<unsigned char>(i % 251 + 1);
    return record;
}

TEST(PlaylistRecord, TheIntegerLandsInTheCallersRecordEvenWhenNothingIsSent)
{
    vt::SyslogSink log;
    // n goes to offset 6832 in this machine's byte order; nothing else changes.
    AudioPlaylistRecord record = Pattern(), expected = Pattern();
    const std::int32_t n = 0x01020304;
    std::memcpy(reinterpret_cast<unsigned char*>(&expected) + 6832, &n, sizeof n);
    EXPECT_EQ(AudioCtrlSendRecordInt(AUDIO_CMD_23, n, &record), -1);  // no audio daemon
    EXPECT_EQ(std::memcmp(&record, &expected, sizeof expected), 0);
    EXPECT_TRUE(log.WaitFor("ctrl.cpp:27 Failed to connect to /tmp/vexoaudiod.sock."));
}

TEST(PlaylistRefusal, BadArgumentsAreRefusedWithoutAConnection)
{
    vt::SyslogSink log;
    vt::AudioPeer peer;
    EXPECT_EQ(AudioCtrlSendRecord(AUDIO_CMD_20, nullptr), -1);
    EXPECT_EQ(AudioCtrlSendInt(AUDIO_CMD_21, -1), -1);
    EXPECT_EQ(AudioCtrlSendRecordInt(AUDIO_CMD_23, 5, nullptr), -1);
    // Only code 21 refuses a negative number, and 0 is fine for it.
    EXPECT_EQ(AudioCtrlSendInt(AUDIO_CMD_21, 0), 0);
    EXPECT_EQ(AudioCtrlSendInt(AUDIO_CMD_24, -3), 0);
    ASSERT_TRUE(peer.WaitForCount(2));
    EXPECT_FALSE(peer.WaitForCount(3, 300));
    EXPECT_EQ(peer.Commands()[0].ArgText(), "0");
    EXPECT_EQ(peer.Commands()[1].ArgText(), "-3");
    const std::vector<std::string> want = {"playlist.cpp:26 Bad parameter",
                                           "playlist.cpp:55 Bad parameter",
                                           "playlist.cpp:105 Bad parameter"};
    ASSERT_TRUE(vt::WaitUntil([&] { return log.Lines().size() >= want.size(); }, 5000));
    EXPECT_EQ(log.Lines(), want);
}

}  // namespace
