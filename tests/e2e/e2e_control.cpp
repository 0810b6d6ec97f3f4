// Local programs driving the player: actions on "/tmp/vexoctrl", from
// vexorctl and from a raw socket, through the real daemon to the audio
// daemon's stand-in. Every test fails on syslog lines it did not expect.
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "audio_peer.hpp"
#include "harness.hpp"
#include "unix_client.hpp"

namespace {

// Command codes as the audio daemon receives them.
constexpr std::int32_t kRadio = 2, kPlay = 4, kVolumeUp = 12, kCustom = 32, kNextHeld = 33,
                       kCustomHeld = 36;

// Sends action 6 (Play) and waits for its command: everything sent before
// it has been dealt with by then.
void Barrier(vt::AudioPeer& peer, std::size_t expectedBefore)
{
    ASSERT_EQ(vt::Vexorctl({"play"}), 0);
    ASSERT_TRUE(peer.WaitForCount(expectedBefore + 1));
    EXPECT_EQ(peer.Codes().back(), kPlay);
}

TEST(Control, ActionsFromTheClientAndARawSocketBecomeAudioCommands)
{
    vt::SyslogSink log;
    vt::AudioPeer peer;
    vt::Daemon d;
    ASSERT_GT(d.Start(), 0);

    // A raw client, 4 bytes in this machine's order, then the client by
    // name: Play is command 4 with an all-zero argument.
    const int raw = vt::SendAction(6);
    ASSERT_TRUE(vt::Readable(raw, 10000));  // hung up once read
    close(raw);
    ASSERT_EQ(vt::Vexorctl({"play"}), 0);
    ASSERT_TRUE(peer.WaitForCount(2));
    auto cmds = peer.Commands();
    for (const auto& c : cmds) {
        EXPECT_EQ(c.code, kPlay);
        EXPECT_TRUE(c.ZeroFrom(0));
    }

    // Several in one call, by name and by number, in order; the custom
    // actions carry their number as text.
    ASSERT_EQ(vt::Vexorctl({"send", "custom1", "Custom4-Held", "9", "next-held"}), 0);
    ASSERT_TRUE(peer.WaitForCount(6));
    cmds = peer.Commands();
    EXPECT_EQ(cmds[2].code, kCustom);
    EXPECT_EQ(cmds[2].ArgText(), "1");
    EXPECT_TRUE(cmds[2].ZeroFrom(1));
    EXPECT_EQ(cmds[3].code, kCustomHeld);
    EXPECT_EQ(cmds[3].ArgText(), "4");
    EXPECT_TRUE(cmds[3].ZeroFrom(1));
    EXPECT_EQ(cmds[4].code, kVolumeUp);
    EXPECT_EQ(cmds[5].code, kNextHeld);

    // Codes that are not actions are taken and do nothing: 0, negative,
    // 26 and above, and a lone byte (0x06000000 on a big-endian machine).
    ASSERT_EQ(vt::Vexorctl({"0", "-1", "-2147483648", "26", "0x7fffffff"}), 0);
    const int lone = vt::ConnectUnix("/tmp/vexoctrl");
    const unsigned char six = 6;
    ASSERT_EQ(write(lone, &six, 1), 1);
    ASSERT_TRUE(vt::Readable(lone, 10000));
    close(lone);
    // On a little-endian machine that byte is a 6: Play.
    std::int32_t loneValue = 0;
    std::memcpy(&loneValue, &six, 1);
    const std::size_t extra = loneValue == 6 ? 1 : 0;
    Barrier(peer, 6 + extra);
    EXPECT_EQ(peer.Codes().size(), 7u + extra);

    EXPECT_EQ(d.Stop(), 0);
    EXPECT_FALSE(vt::PathExists("/tmp/vexoctrl"));
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

TEST(Control, TheClientsCommandLine)
{
    vt::SyslogSink log;
    std::string out;

    // Without a daemon: a clear message and status 1.
    EXPECT_EQ(vt::Vexorctl({"play"}, &out), 1);
    EXPECT_NE(out.find("vexorcd is not running"), std::string::npos) << out;

    EXPECT_EQ(vt::Vexorctl({"--list"}, &out), 0);
    EXPECT_NE(out.find("\n  6  play\n"), std::string::npos) << out;
    EXPECT_NE(out.find("\n 24  custom3-held\n"), std::string::npos) << out;
    EXPECT_EQ(std::count(out.begin(), out.end(), '\n'), 26);

    EXPECT_EQ(vt::Vexorctl({"--help"}, &out), 0);
    EXPECT_NE(out.find("Exit status"), std::string::npos) << out;
    EXPECT_EQ(vt::Vexorctl({}, &out), 2);

    // Usage errors send nothing, not even the valid actions before them.
    vt::AudioPeer peer;
    vt::Daemon d;
    ASSERT_GT(d.Start(), 0);
    for (const std::vector<std::string>& bad :
         {std::vector<std::string>{"stop", "bogus"}, {"stop", "2147483648"}, {"send"}, {"--bogus"},
          {"stop", "0x"}, {"list", "extra"}}) {
        EXPECT_EQ(vt::Vexorctl(bad, &out), 2) << bad.back();
        EXPECT_NE(out.find("--help"), std::string::npos) << out;
    }
    Barrier(peer, 0);
    EXPECT_EQ(peer.Codes().size(), 1u);
    EXPECT_EQ(d.Stop(), 0);
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

}  // namespace
