// The stand-in audio daemon, run as its own program, against the real client.
#include <signal.h>
#include <sys/wait.h>

#include <string>

#include <gtest/gtest.h>

#include "audioctl/ctrl.hpp"
#include "audioctl/playlist.hpp"
#include "harness.hpp"

namespace {

// Starts standin-audiod with args and waits until it listens.
vt::Process StartStandin(const std::vector<std::string>& args)
{
    std::vector<std::string> argv = {vt::BinPath("standin-audiod")};
    argv.insert(argv.end(), args.begin(), args.end());
    vt::Process p = vt::Process::Start(argv);
    EXPECT_TRUE(p.WaitForOutput("listening on /tmp/vexoaudiod.sock", 10000)) << p.Output();
    return p;
}

// Stops it the way an init script would: it must exit 0 and remove its socket.
void StopStandin(vt::Process& p)
{
    p.Signal(SIGTERM);
    const int status = p.Wait();
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
    EXPECT_FALSE(vt::PathExists(AUDIO_SOCKET_PATH));
}

TEST(StandinAudiod, PrintsOneDecodedLinePerCommand)
{
    vt::SyslogSink log;
    vt::Process audiod = StartStandin({});
    AudioPlaylistRecord playlist {};
    const float bands[AUDIO_EQ_BANDS] = {0, 1.5f, -2, 12, 0, 0, 0, 0, 0, -0.5f};
    AudioCmdRecord odd {};
    odd.code = 99;
    odd.arg[100] = 1;
    char reply[AUDIO_REPLY_SIZE];

    EXPECT_EQ(AudioCtrlSendBare(AUDIO_CMD_PLAY), 0);
    EXPECT_EQ(AudioCtrlSendInt(AUDIO_CMD_CUSTOM, 3), 0);
    EXPECT_EQ(AudioCtrlSendRecordInt(AUDIO_CMD_23, 42, &playlist), 0);
    EXPECT_EQ(AudioCtrlSetEqBands(bands), 0);
    EXPECT_EQ(AudioCtrlTransact(odd, reply, sizeof reply), 0);
    EXPECT_STREQ(reply, "ok");

    const char* want[] = {
        "AUDIO_CMD_PLAY (4)",
        "AUDIO_CMD_CUSTOM (32) \"3\"",
        "AUDIO_CMD_23 (23) record of 7872 bytes, int at 6832 = 42",
        "AUDIO_CMD_SET_EQ (35) \"0.0 1.5 -2.0 12.0 0.0 0.0 0.0 0.0 0.0 -0.5\"",
        "unknown (99) [stray bytes after the argument]",
    };
    for (const char* line : want) {
        std::string got;
        ASSERT_TRUE(audiod.ReadLine(got)) << audiod.Output();
        EXPECT_EQ(got, line);
    }
    StopStandin(audiod);
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

TEST(StandinAudiod, MisbehavesOnRequest)
{
    // Closing without an answer is a read failure for the client.
    vt::SyslogSink log;
    vt::Process audiod = StartStandin({"--close"});
    EXPECT_EQ(AudioCtrlSendBare(AUDIO_CMD_STOP), -1);
    EXPECT_TRUE(audiod.WaitForOutput("AUDIO_CMD_STOP (5)"));
    EXPECT_TRUE(log.WaitFor("ctrl.cpp:90 Failed to read action ["));
    StopStandin(audiod);
}

}  // namespace
