// The radio receiver end to end: the real daemon reads a FIFO at the
// receiver's device path, fed by remote-sim, and talks to an in-process audio
// daemon and, where a test wants one, to standin-mediacenter.
#include <signal.h>

#include <chrono>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "audio_peer.hpp"
#include "audioctl/ctrl.hpp"
#include "harness.hpp"
#include "remote.hpp"

namespace {

constexpr char DEVICE[] = "/dev/usb/hiddev5";

void Pause(int ms) { std::this_thread::sleep_for(std::chrono::milliseconds(ms)); }

class Raytac : public ::testing::Test {
protected:
    void SetUp() override
    {
        ASSERT_GT(daemon_.Start(false), 0);
        ASSERT_TRUE(Receiving(true)) << "the daemon did not open the receiver";
    }
    void TearDown() override
    {
        if (daemon_.Pid() > 0) {
            EXPECT_EQ(daemon_.Stop(), 0);
        }
        EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
    }
    // Runs a remote-sim script; it returns once the daemon has read every report.
    int Sim(const std::vector<std::string>& script)
    {
        std::string out;
        const int code = vt::RemoteSim(script, &out);
        last_ = out;
        return code;
    }
    bool Receiving(bool open)
    {
        return vt::WaitUntil([&] { return vt::HoldsOpen(daemon_.Pid(), DEVICE) == open; }, 10000);
    }
    // The command codes received once nothing more has arrived for quietMs
    // (or after 20 rounds of it, should the commands never stop).
    std::vector<std::int32_t> Settled(int quietMs = 700)
    {
        std::size_t n = audio_.Codes().size();
        for (int round = 0; round < 20; ++round) {
            Pause(quietMs);
            const std::size_t now = audio_.Codes().size();
            if (now == n)
                break;
            n = now;
        }
        return audio_.Codes();
    }

    vt::SyslogSink log_;
    vt::AudioPeer audio_;
    vt::ReceiverFifo fifo_;  // a writer before the daemon opens the device
    vt::Daemon daemon_;
    std::string last_;
};

TEST_F(Raytac, KeysBecomeAudioCommands)
{
    // Unmapped keys are ignored; the second Stop key stops; custom keys carry their number.
    ASSERT_EQ(Sim({"tap", "Play", "tap", "0x00070004", "tap", "0x00070053", "tap", "Custom 2"}), 0)
        << last_;
    ASSERT_TRUE(audio_.WaitForCount(3));
    EXPECT_EQ(Settled(), (std::vector<std::int32_t> {AUDIO_CMD_PLAY, AUDIO_CMD_STOP, AUDIO_CMD_CUSTOM}));
    EXPECT_EQ(audio_.Commands().at(2).ArgText(), "2");
}

TEST_F(Raytac, NextGivesItsActionAtAShortReleaseAndItsHeldVariantOnceWhenHeld)
{
    ASSERT_EQ(Sim({"tap", "Next"}), 0) << last_;
    ASSERT_TRUE(audio_.WaitForCount(1));
    // Four idle waits take 800 ms or more; a hold three times as long is sure to pass them.
    ASSERT_EQ(Sim({"hold", "Next", "2500"}), 0) << last_;
    EXPECT_EQ(Settled(), (std::vector<std::int32_t> {AUDIO_CMD_NEXT, AUDIO_CMD_NEXT_HELD}));
}

TEST_F(Raytac, VolumePlusRepeatsWhileHeldAndStopsAtTheRelease)
{
    ASSERT_EQ(Sim({"hold", "vol+", "2000"}), 0) << last_;
    const auto codes = Settled();
    // The press and about one step per 200 ms wait; the bounds leave room for a slow machine.
    EXPECT_GE(codes.size(), 4u);
    EXPECT_LE(codes.size(), 14u);
    EXPECT_EQ(codes, std::vector<std::int32_t>(codes.size(), AUDIO_CMD_VOLUME_UP));
}

TEST_F(Raytac, AListeningMediaCenterTakesTheKeysInsteadOfTheAudioDaemon)
{
    vt::Process mc = vt::Process::Start({vt::BinPath("standin-mediacenter")});
    ASSERT_TRUE(mc.WaitForOutput("listening /tmp/MediaCenter.sock"));
    ASSERT_EQ(Sim({"tap", "Play", "hold", "Volume Minus", "500"}), 0) << last_;
    EXPECT_TRUE(mc.WaitForOutput("key 0x0007002C"));
    EXPECT_TRUE(mc.WaitForOutput("key 0x00070056"));
    EXPECT_TRUE(Settled().empty());

    // Once it has gone (and removed its socket), the daemon acts again.
    mc.Signal(SIGTERM);
    EXPECT_EQ(mc.Wait(), 0);
    EXPECT_FALSE(vt::PathExists("/tmp/MediaCenter.sock"));
    ASSERT_EQ(Sim({"tap", "Play"}), 0) << last_;
    EXPECT_TRUE(audio_.WaitForCount(1));
}

TEST_F(Raytac, SignalsCloseAndReopenTheReceiverAndAHeldVolumeKeyDoesNotRunAway)
{
    ASSERT_EQ(Sim({"press", "Volume Plus"}), 0) << last_;
    ASSERT_TRUE(audio_.WaitForCount(2));  // the press and a repeat: the key is held
    daemon_.Signal(SIGUSR2);
    ASSERT_TRUE(Receiving(false));
    const std::size_t steps = Settled(300).size();
    EXPECT_EQ(Sim({"tap", "Play"}), 1) << "a closed receiver reads nothing: " << last_;
    daemon_.Signal(SIGUSR1);
    ASSERT_TRUE(Receiving(true));
    daemon_.Signal(SIGUSR1);  // already open: nothing changes
    // The release never came, but the reopened receiver has forgotten the key.
    Pause(1200);  // six idle waits
    EXPECT_EQ(audio_.Codes().size(), steps) << "the volume ran away";
    ASSERT_EQ(Sim({"release", "Volume Plus", "tap", "Stop"}), 0) << last_;
    EXPECT_TRUE(audio_.WaitForCount(steps + 1));
    const auto codes = Settled();
    EXPECT_EQ(codes.size(), steps + 1);
    EXPECT_EQ(codes.back(), AUDIO_CMD_STOP);
}

}  // namespace
