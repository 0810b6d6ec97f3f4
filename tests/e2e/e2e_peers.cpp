// The daemon among its peers when they misbehave, each of them the stand-in
// program itself: the audio daemon (standin-audiod), the radio remote
// (remote-sim, writing into a FIFO at the receiver's device path), the
// media-center interface (standin-mediacenter) and a local program
// (vexorctl). On the PowerPC build they all run big-endian, as on the target;
// tests/kernel runs the keys, the hand-over and a replug on a PowerPC kernel,
// and the receiver's unit test pins that a reopen forgets a key left down.
#include <optional>

#include "harness.hpp"
#include "lib/proc_fds.hpp"

namespace {

// The daemon stops within its receiver's wait and an exchange under way (a connect and a reply of
// 500 ms each), and room for the emulator.
constexpr int STOP_MS = 200 + 1000 + 2000;

class Peers : public ::testing::Test {
protected:
    // The audio daemon's stand-in, the remote's FIFO and the daemon.
    void Start(const std::vector<std::string>& audiod = {"standin-audiod"})
    {
        vt::Logged();
        audiod_.emplace(audiod);
        ASSERT_TRUE(audiod_->Expect("standin-audiod: listening on /tmp/vexoaudiod.sock"));
        remote_.emplace(std::vector<std::string> {"remote-sim", "--stay"});  // holds the FIFO open
        ASSERT_TRUE(remote_->Expect(std::string("ready ") + RC_RAYTAC_DEVICE_PATH));
        ASSERT_GT(daemon_.emplace().pid, 0);
    }
    // It logs nothing that the test's fault does not explain.
    void TearDown() override
    {
        if (daemon_ && daemon_->pid > 0) {
            EXPECT_EQ(daemon_->Stop(SIGTERM, STOP_MS), 0);
        }
        for (const std::string& line : vt::Logged())
            EXPECT_TRUE(std::count(allowed_.begin(), allowed_.end(), line)) << "unexpected log line: " << line;
    }
    // The next command the audio daemon received.
    std::string Next()
    {
        std::string line;
        return audiod_->Line(line, 3000) ? line : "(nothing)";
    }
    std::optional<vt::Program> audiod_, remote_;
    std::optional<vt::Daemon> daemon_;
    std::vector<std::string> allowed_;  // log lines that the test's fault explains
};

TEST_F(Peers, AFrozenMediaCenterHoldsNothingUp)
{
    Start();
    vt::Program frozen({"standin-mediacenter", "--frozen"});  // its queue takes ten keys
    ASSERT_TRUE(frozen.Expect("frozen /tmp/MediaCenter.sock"));
    std::vector<std::string> taps {"remote-sim"};
    for (int i = 0; i < 12; ++i)
        taps.insert(taps.end(), {"tap", "Play"});
    ASSERT_EQ(vt::Run(taps), 0);
    EXPECT_EQ(Next(), "AUDIO_CMD_PLAY (4)");  // the daemon acts on the others itself
}

TEST_F(Peers, AnAudioDaemonThatHangsHoldsNothingUp)
{
    // Not answering, or not accepting: five connections fit its queue, the connects after them give
    // up (or end when the daemon stops). Actions are taken and keys read all along, and the daemon
    // stops promptly with an exchange under way.
    const std::string failed = "ctrl.cpp:27 Failed to connect to /tmp/vexoaudiod.sock. [";
    allowed_ = {failed + "Resource temporarily unavailable]", failed + "Interrupted system call]"};
    for (const char* mode : {"--never-answer", "--stop-accepting"}) {
        Start({"standin-audiod", mode});
        for (int i = 0; i < 6; ++i)
            ASSERT_EQ(vt::Run({"vexorctl", "play"}), 0) << mode << ": action " << i << " was not taken";
        ASSERT_EQ(vt::Run({"remote-sim", "tap", "Stop"}), 0);
        ASSERT_EQ(vt::Run({"vexorctl", "play"}), 0);
        EXPECT_EQ(daemon_->Stop(SIGTERM, STOP_MS), 0) << mode;
    }
}

TEST_F(Peers, HotplugSignalsNeitherCutAShortPressLongNorLeaveAClosedReceiverRepeating)
{
    Start();
    ASSERT_EQ(vt::Run({"remote-sim", "press", "Next"}), 0);
    for (int i = 0; i < 150; ++i, usleep(2000))  // a storm of them in a short press: the waits resume
        kill(daemon_->pid, SIGUSR1);
    ASSERT_EQ(vt::Run({"remote-sim", "release", "Next", "press", "Volume Plus"}), 0);
    EXPECT_EQ(Next(), "AUDIO_CMD_NEXT (6)");
    EXPECT_EQ(Next(), "AUDIO_CMD_VOLUME_UP (12)");
    EXPECT_EQ(Next(), "AUDIO_CMD_VOLUME_UP (12)");  // repeated while held
    kill(daemon_->pid, SIGUSR2);
    ASSERT_TRUE(ProcWaitHoldsOpen(daemon_->pid, RC_RAYTAC_DEVICE_PATH, false, 5000));
    ASSERT_EQ(vt::Run({"vexorctl", "stop"}), 0);
    std::string line;
    while ((line = Next()) == "AUDIO_CMD_VOLUME_UP (12)") {
    }
    EXPECT_EQ(line, "AUDIO_CMD_STOP (5)");  // and the repeats have ended with the close
}

}  // namespace
