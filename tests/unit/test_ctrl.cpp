// The audio command client: the exchange against a real peer on the daemon's
// socket, and the equalizer profile. The records of each argument form are
// checked byte for byte end to end, through vexorctl.
#include <unistd.h>

#include <chrono>
#include <cstring>
#include <string>
#include <thread>

#include <gtest/gtest.h>

#include "audio_peer.hpp"
#include "audioctl/ctrl.hpp"
#include "fault_kit.hpp"
#include "harness.hpp"

namespace {

using Mode = vt::AudioPeer::Mode;

// Milliseconds one exchange takes; its result in *result.
long TimedTransact(std::int32_t* result)
{
    const AudioCmdRecord request {};
    char reply[AUDIO_REPLY_SIZE];
    const auto start = std::chrono::steady_clock::now();
    *result = AudioCtrlTransact(request, reply, sizeof reply);
    return static_cast<long>(std::chrono::duration_cast<std::chrono::milliseconds>(
                                 std::chrono::steady_clock::now() - start).count());
}

TEST(CtrlExchange, TheAnswerIsReadOnceIntoAClearedBufferUpToItsCapacity)
{
    vt::AudioPeer peer;
    const AudioCmdRecord request {};
    char reply[40];
    std::memset(reply, 'x', sizeof reply);
    EXPECT_EQ(AudioCtrlTransact(request, reply, 32), 0);
    EXPECT_EQ(std::string(reply, 32), std::string("k").append(31, '\0'));
    EXPECT_EQ(std::string(reply + 32, 8), "xxxxxxxx");
    peer.SetMode(Mode::AnswerHuge);
    EXPECT_EQ(AudioCtrlTransact(request, reply, 32), 0);
    EXPECT_EQ(std::string(reply, 40), std::string(32, 'h') + "xxxxxxxx");
}

TEST(CtrlExchange, FailuresThatNeedNoWaitingFailAtOnceWithTheirMessages)
{
    vt::SyslogSink log;
    const AudioCmdRecord request {};
    char reply[8] = "keepme";
    std::int32_t result = 0;
    {
        vt::AudioPeer peer;
        EXPECT_EQ(AudioCtrlTransact(request, nullptr, 8192), -1);
        EXPECT_EQ(AudioCtrlTransact(request, reply, 0), -1);
        EXPECT_EQ(AudioCtrlTransact(request, reply, -1), -1);
        EXPECT_FALSE(peer.WaitForCount(1, 300));  // nobody connected
        EXPECT_STREQ(reply, "keepme");
        // A peer that hangs up without answering is readable at once.
        peer.SetMode(Mode::CloseWithoutAnswer);
        EXPECT_LT(TimedTransact(&result), 450);
        EXPECT_EQ(result, -1);
    }
    EXPECT_LT(TimedTransact(&result), 250);  // no audio daemon: no waiting
    EXPECT_EQ(result, -1);

    const std::string bad = "ctrl.cpp:46 Bad parameter";
    ASSERT_TRUE(vt::WaitUntil([&] { return log.Lines().size() >= 5; }, 5000));
    auto lines = log.Lines();
    EXPECT_EQ(lines[3].rfind("ctrl.cpp:90 Failed to read action [", 0), 0u) << log.Dump();
    lines.erase(lines.begin() + 3);
    EXPECT_EQ(lines, (std::vector<std::string>{bad, bad, bad,
        "ctrl.cpp:27 Failed to connect to /tmp/vexoaudiod.sock. [No such file or directory]"}));
}

TEST(CtrlExchange, TheAnswerMustComeWithinTheBudget)
{
    vt::SyslogSink log;
    std::int32_t result = 0;
    {
        vt::AudioPeer peer(Mode::AnswerLate, 150);
        TimedTransact(&result);
        EXPECT_EQ(result, 0);
    }
    for (Mode mode : {Mode::AnswerLate, Mode::NeverAnswer}) {
        vt::AudioPeer peer(mode, 1500);
        const long ms = TimedTransact(&result);
        EXPECT_EQ(result, -1);
        EXPECT_GE(ms, 480);
        EXPECT_LT(ms, 1300);
    }
    usleep(100000);
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();  // a time-out is not logged
}

TEST(CtrlExchange, APeerThatStopsAcceptingCannotHangTheClient)
{
    // Once its listen queue is full a connect would block for ever; it must
    // give up within the budget, like a refused one.
    vt::SyslogSink log;
    vt::AudioPeer peer(Mode::StopAccepting);
    for (int i = 0; i < 8; ++i) {
        std::int32_t result = 0;
        EXPECT_LT(TimedTransact(&result), 2000) << i;
        EXPECT_EQ(result, -1);
    }
    EXPECT_TRUE(log.WaitFor("ctrl.cpp:27 Failed to connect to /tmp/vexoaudiod.sock. "
                            "[Resource temporarily unavailable]")) << log.Dump();

    // Signals while the connect waits for room do not lose the command: the
    // connect goes on for what is left of its budget.
    std::int32_t result = -1;
    {
        vt::ThreadSignalStorm storm;
        std::thread accepting([&] {
            usleep(200000);
            peer.SetMode(Mode::Answer);
        });
        TimedTransact(&result);
        accepting.join();
    }
    EXPECT_EQ(result, 0);
    usleep(100000);
    EXPECT_EQ(log.Count("[Interrupted system call]"), 0) << log.Dump();
}

// ---- Equalizer profile ----------------------------------------------------

constexpr char kFile[] = "/tmp/profiles";
constexpr char kConf[] = "/var/lib/vexora/audio.conf";

class EqProfile : public ::testing::Test {
protected:
    void SetUp() override
    {
        for (const char* file : {AUDIO_EQ_SYSTEM_FILE, AUDIO_EQ_USER_FILE, kConf}) {
            vt::MakeParentDirs(file);
            unlink(file);
        }
    }
    // Searches a file of this content for name: "<result>value", out as it was left.
    static std::string Lookup(const std::string& content, const char* name, std::int32_t outSize = 2048)
    {
        vt::WriteFile(kFile, content);
        char out[2048] = "-";
        std::string got = std::to_string(AudioEqLookupProfile(kFile, name, out, outSize));
        got += out;
        return got;
    }
    // AudioEqGetDefault, the same way.
    static std::string Default()
    {
        char out[256] = "-";
        std::string got = std::to_string(AudioEqGetDefault(out, sizeof out));
        got += out;
        return got;
    }
    vt::SyslogSink log;
};

TEST_F(EqProfile, FirstLineWhoseNameIsAPrefixWinsSplitAtTheLastColon)
{
    const std::string file = "Rock: 1 2 3 \nRock Live:4 5 6\nJazz:Club:7 8\n";
    EXPECT_EQ(Lookup(file, "Rock Live"), "11 2 3");
    EXPECT_EQ(Lookup(file, "Jazz:Club"), "17 8");
    for (const char* name : {"Jazz", "Roc", "rock", ""})
        EXPECT_EQ(Lookup(file, name), "0-") << name;  // out is left alone
    EXPECT_EQ(Lookup(file + ":flat\n", "Pop"), "1flat");  // an empty name answers all
    EXPECT_EQ(Lookup(file, "Rock", 4), "11");  // cut to " 1 ", then trimmed
    EXPECT_EQ(Lookup("", "Rock"), "0-");
    EXPECT_EQ(Lookup("Rock:1\n\nPop:2\n", "Rock"), "11");  // the search ends at the match
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

TEST_F(EqProfile, ALineWithoutColonOrAMissingFileFails)
{
    EXPECT_EQ(Lookup("Rock:1\n\nPop:2\n", "Pop"), "-1-");
    EXPECT_EQ(Lookup("Rock:1\n# comment\nPop:2", "Pop"), "-1-");
    // 1023 characters, then "Tail:b" on the same line: a piece of its own.
    const std::string first = std::string("Long:").append(1018, 'a');
    EXPECT_EQ(Lookup(first + "Tail:b\n", "Tail"), "1b");
    EXPECT_EQ(Lookup(first + "Tail:b\n", "Long"), std::string("1").append(1018, 'a'));
    // Exactly 1023 characters before the newline: the newline is a piece without ':'.
    EXPECT_EQ(Lookup(first + "\nQ:y\n", "Q"), "-1-");
    char out[8] = "same";
    EXPECT_EQ(AudioEqLookupProfile("/tmp/no-such-file", "Rock", out, sizeof out), -1);
    EXPECT_STREQ(out, "same");

    const std::string blank = "ctrl.cpp:546 The EQ profile [\n] is illegal.";
    const std::vector<std::string> want = {
        blank, "ctrl.cpp:546 The EQ profile [# comment\n] is illegal.", blank};
    ASSERT_TRUE(vt::WaitUntil([&] { return log.Lines().size() >= want.size(); }, 5000));
    EXPECT_EQ(log.Lines(), want);
}

TEST_F(EqProfile, DefaultNeedsExactlyYesAndAProfileName)
{
    vt::WriteFile(AUDIO_EQ_SYSTEM_FILE, ":flat\n");
    for (const char* enabled : {"Yes", "\"yes \"", "yess", "no", ""}) {
        vt::WriteFile(kConf, std::string("audio_enable_equalizer=") + enabled +
                                 "\naudio_default_equalizer=Rock\n");
        EXPECT_EQ(Default(), "0-") << enabled;
    }
    vt::WriteFile(kConf, "audio_enable_equalizer=yes\n");
    EXPECT_EQ(Default(), "0-");
    unlink(kConf);
    EXPECT_EQ(Default(), "0-");
    vt::WriteFile(kConf, "audio_enable_equalizer=yes\naudio_default_equalizer=Rock\n");
    EXPECT_EQ(Default(), "1flat");
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

TEST_F(EqProfile, DefaultTakesTheUserFileOnlyWhenTheSystemFileHasNoMatch)
{
    vt::WriteFile(kConf, "audio_enable_equalizer=yes\naudio_default_equalizer=Rock Live\n");
    vt::WriteFile(AUDIO_EQ_USER_FILE, "Rock:user\n");
    vt::WriteFile(AUDIO_EQ_SYSTEM_FILE, "Pop:1\nRock:system\n");
    EXPECT_EQ(Default(), "1system");
    vt::WriteFile(AUDIO_EQ_SYSTEM_FILE, "Pop:1\n");
    EXPECT_EQ(Default(), "1user");
    vt::WriteFile(AUDIO_EQ_USER_FILE, "Jazz:user\n");
    EXPECT_EQ(Default(), "0-");
    unlink(AUDIO_EQ_USER_FILE);  // a missing user file fails without a message
    EXPECT_EQ(Default(), "-1-");
    usleep(100000);
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();

    // A failed system search ends it, although the user file has the profile.
    vt::WriteFile(AUDIO_EQ_USER_FILE, "Rock:user\n");
    vt::WriteFile(AUDIO_EQ_SYSTEM_FILE, "\nRock:system\n");
    EXPECT_EQ(Default(), "-1-");
    unlink(AUDIO_EQ_SYSTEM_FILE);
    EXPECT_EQ(Default(), "-1-");
    const std::string failed = "ctrl.cpp:603 Failed to open the system EQ profile "
                               "[/var/packages/Sonarium/target/etc/equalizer.system].";
    const std::vector<std::string> want = {"ctrl.cpp:546 The EQ profile [\n] is illegal.",
                                           failed, failed};
    ASSERT_TRUE(vt::WaitUntil([&] { return log.Lines().size() >= want.size(); }, 5000));
    EXPECT_EQ(log.Lines(), want);
}

}  // namespace
