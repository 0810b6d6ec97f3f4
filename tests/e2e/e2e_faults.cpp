// Faults injected around the real daemon: an audio daemon that is absent,
// late, silent, closes early, answers too much or stops accepting; a frozen
// media-center interface; a receiver that goes away in the middle of a press;
// a storm of hot-plug signals; control clients that never send; a pid file
// that cannot be written. In every case the daemon stays up, logs only the
// messages the fault explains, stops on SIGTERM within a second plus its
// budgets, and serves the next action once the fault is gone.
#include <signal.h>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <chrono>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "audio_peer.hpp"
#include "audioctl/ctrl.hpp"
#include "common/rc_types.hpp"
#include "fault_kit.hpp"
#include "harness.hpp"
#include "remote.hpp"
#include "unix_client.hpp"

namespace {

using Mode = vt::AudioPeer::Mode;

constexpr char kDevice[] = "/dev/usb/hiddev5";
constexpr char kPidFile[] = "/var/run/vexorcd.pid";
// A second, plus the receiver's wait and one exchange with the audio daemon
// (500 ms to connect, 500 ms for its waits) that may be under way when
// SIGTERM arrives...
constexpr int kStopBudgetMs = 1000 + 200 + 500 + 500;
// ...and room for the emulator and the sanitizers to start and end a process.
constexpr int kStopMs = kStopBudgetMs + 1500;

// Usages of the receiver's keys.
constexpr std::uint32_t kPlayKey = 0x0007002C;
constexpr std::uint32_t kStopKey = 0x0007004F;
constexpr std::uint32_t kVolumeUpKey = 0x00070057;

// The messages each fault explains.
const std::string kConnectFailed = "ctrl.cpp:27 Failed to connect to /tmp/vexoaudiod.sock. [";
const std::string kReadFailed = "ctrl.cpp:90 Failed to read action [";
const std::string kShortRead = "hw_raytac.cpp (304) Got short read from device!";

void Pause(int ms) { std::this_thread::sleep_for(std::chrono::milliseconds(ms)); }

std::size_t CountOf(const std::vector<std::int32_t>& codes, std::int32_t code)
{
    return static_cast<std::size_t>(std::count(codes.begin(), codes.end(), code));
}

std::string Text(const std::vector<std::int32_t>& codes)
{
    std::string s;
    for (std::int32_t c : codes)
        s += std::to_string(c) + " ";
    return s;
}

class Faults : public ::testing::Test {
protected:
    // Starts the daemon, with the receiver's FIFO in place when withReceiver.
    void Start(bool withReceiver)
    {
        if (withReceiver)
            fifo_.emplace(kDevice);
        ASSERT_GT(daemon_.Start(), 0);
        if (withReceiver) {
            ASSERT_TRUE(Receiving(kDevice, true)) << "the daemon did not open the receiver";
        }
    }

    void TearDown() override
    {
        if (daemon_.Pid() > 0) {
            EXPECT_EQ(daemon_.Stop(SIGTERM, kStopMs), 0) << "did not stop on SIGTERM in time";
        }
        const auto other = vt::LinesOtherThan(log_, allowed_);
        EXPECT_TRUE(other.empty()) << "messages no fault explains:\n" << log_.Dump();
    }

    bool Receiving(const std::string& path, bool open)
    {
        return vt::WaitUntil([&] { return vt::HoldsOpen(daemon_.Pid(), path) == open; }, 10000);
    }

    // A press and a release of a key, each read by the daemon.
    void Tap(std::uint32_t usage)
    {
        ASSERT_TRUE(vt::WriteReport(*fifo_, usage, 1)) << "the daemon does not read the receiver";
        ASSERT_TRUE(vt::WriteReport(*fifo_, usage, 0)) << "the daemon does not read the receiver";
    }

    // Injects action and waits until the audio daemon has its command.
    void Served(std::int32_t action, std::int32_t code)
    {
        const std::size_t before = audio_->Codes().size();
        ASSERT_TRUE(vt::InjectAction(action)) << "the daemon did not take action " << action;
        ASSERT_TRUE(audio_->WaitForCount(before + 1)) << "no command for action " << action;
        EXPECT_EQ(audio_->Codes().back(), code);
    }

    vt::SyslogSink log_;
    std::optional<vt::AudioPeer> audio_;
    std::optional<vt::ReceiverFifo> fifo_;
    vt::Daemon daemon_;
    std::vector<std::string> allowed_;  // message prefixes the test's faults explain
};

TEST_F(Faults, AbsentAudioDaemonCostsEachActionOneMessageUntilItComes)
{
    allowed_ = {kConnectFailed};
    Start(false);
    const std::string absent = kConnectFailed + "No such file or directory]";
    for (int i = 0; i < 3; ++i)
        ASSERT_TRUE(vt::InjectAction(RC_ACT_PLAY));
    ASSERT_TRUE(vt::WaitUntil([&] { return log_.Count(absent) == 3; }, 5000)) << log_.Dump();
    // A socket file that nobody listens on any more: refused, not absent.
    close(vt::BindUnix(AUDIO_SOCKET_PATH));
    ASSERT_TRUE(vt::InjectAction(RC_ACT_STOP));
    ASSERT_TRUE(log_.WaitFor("[Connection refused]"));
    EXPECT_EQ(log_.Count(kConnectFailed + "Connection refused]"), 1) << log_.Dump();

    audio_.emplace(Mode::Answer);
    Served(RC_ACT_PLAY, AUDIO_CMD_PLAY);
    EXPECT_EQ(log_.Lines().size(), 4u) << log_.Dump();
}

TEST_F(Faults, LateOrSilentAudioDaemonCostsAtMostTheBudgetAndNoMessage)
{
    audio_.emplace(Mode::AnswerLate, 250);
    Start(false);
    Served(RC_ACT_PLAY, AUDIO_CMD_PLAY);  // late, within the budget

    // Silent, and later than the budget: the daemon gives up without a word.
    audio_->SetMode(Mode::NeverAnswer);
    ASSERT_TRUE(vt::InjectAction(RC_ACT_STOP));
    ASSERT_TRUE(vt::InjectAction(RC_ACT_RADIO));
    audio_->SetMode(Mode::AnswerLate, 900);
    ASSERT_TRUE(vt::InjectAction(RC_ACT_IPOD));
    // Every record still arrived whole, once.
    ASSERT_TRUE(audio_->WaitForCount(4));

    audio_->SetMode(Mode::Answer);
    Served(RC_ACT_NEXT, AUDIO_CMD_NEXT);
    EXPECT_EQ(audio_->Codes(), (std::vector<std::int32_t> {AUDIO_CMD_PLAY, AUDIO_CMD_STOP,
                                                           AUDIO_CMD_RADIO, AUDIO_CMD_IPOD,
                                                           AUDIO_CMD_NEXT}));
    for (const auto& c : audio_->Commands())
        EXPECT_EQ(c.bytes, 8196u);
}

TEST_F(Faults, AudioDaemonClosingEarlyOrAnsweringHugeIsSurvived)
{
    allowed_ = {kReadFailed};
    audio_.emplace(Mode::CloseWithoutAnswer);
    Start(false);
    ASSERT_TRUE(vt::InjectAction(RC_ACT_PLAY));
    ASSERT_TRUE(log_.WaitFor(kReadFailed));

    // An answer three times the reply buffer: the rest goes with the connection.
    audio_->SetMode(Mode::AnswerHuge);
    Served(RC_ACT_STOP, AUDIO_CMD_STOP);
    Served(RC_ACT_RADIO, AUDIO_CMD_RADIO);
    audio_->SetMode(Mode::Answer);
    Served(RC_ACT_PLAY, AUDIO_CMD_PLAY);
    EXPECT_EQ(log_.Lines().size(), 1u) << log_.Dump();
}

TEST_F(Faults, AudioDaemonThatStopsAcceptingCannotHangTheDaemon)
{
    allowed_ = {kConnectFailed};
    audio_.emplace(Mode::StopAccepting);
    Start(true);
    // The first connections wait in the audio daemon's queue until the reply
    // wait gives up; once the queue is full, the connect itself must give up.
    for (int i = 0; i < 8; ++i)
        ASSERT_TRUE(vt::InjectAction(RC_ACT_PLAY, 5000)) << "the daemon hangs (action " << i << ")";
    ASSERT_TRUE(log_.WaitFor(kConnectFailed + "Resource temporarily unavailable]"))
        << log_.Dump();
    // The receiver is served all along.
    Tap(kStopKey);

    audio_->SetMode(Mode::Answer);
    ASSERT_TRUE(vt::InjectAction(RC_ACT_RANDOM100));
    ASSERT_TRUE(vt::WaitUntil([&] { return CountOf(audio_->Codes(), AUDIO_CMD_RANDOM100) == 1; }, 5000))
        << "the action after the fault was not served";
}

TEST_F(Faults, StopsOnSigtermWhileAnExchangeHangs)
{
    allowed_ = {kConnectFailed};
    for (const Mode mode : {Mode::NeverAnswer, Mode::StopAccepting}) {
        audio_.emplace(mode);
        Start(false);
        // Enough actions to fill the audio daemon's queue, then one in flight.
        const int fill = mode == Mode::StopAccepting ? 6 : 1;
        for (int i = 0; i < fill; ++i)
            ASSERT_TRUE(vt::InjectAction(RC_ACT_PLAY, 5000));
        const int inFlight = vt::SendAction(RC_ACT_STOP);
        ASSERT_GE(inFlight, 0);
        ASSERT_TRUE(vt::Readable(inFlight, 5000));  // taken: its exchange runs
        close(inFlight);
        EXPECT_EQ(daemon_.Stop(SIGTERM, kStopMs), 0) << "mode " << static_cast<int>(mode);
        audio_.reset();
    }
}

TEST_F(Faults, FrozenMediaCenterCannotHangTheDaemon)
{
    audio_.emplace(Mode::Answer);
    Start(true);
    constexpr std::size_t kTaps = 16;
    {
        vt::MediaCenterUi ui(false);  // bound, never reads
        for (std::size_t i = 0; i < kTaps; ++i)
            Tap(kPlayKey);
        // The keys its full queue did not take, the daemon acted on itself.
        ui.Thaw();
        ASSERT_TRUE(vt::WaitUntil([&] {
            return ui.Codes().size() + CountOf(audio_->Codes(), AUDIO_CMD_PLAY) == kTaps;
        }, 5000)) << ui.Codes().size() << " keys to the interface, "
                  << CountOf(audio_->Codes(), AUDIO_CMD_PLAY) << " Play commands";
        EXPECT_GT(ui.Codes().size(), 0u);
        EXPECT_GT(CountOf(audio_->Codes(), AUDIO_CMD_PLAY), 0u);

        // Reading again, it takes the keys.
        const std::size_t taken = ui.Codes().size();
        Tap(kStopKey);
        ASSERT_TRUE(vt::WaitUntil([&] { return ui.Codes().size() == taken + 1; }, 5000));
        EXPECT_EQ(ui.Codes().back(), kStopKey);
    }
    // Gone: the daemon acts on the keys again.
    Tap(kStopKey);
    ASSERT_TRUE(vt::WaitUntil([&] { return CountOf(audio_->Codes(), AUDIO_CMD_STOP) == 1; }, 5000));
}

TEST_F(Faults, ReceiverGoneInTheMiddleOfAPress)
{
    allowed_ = {kShortRead};
    audio_.emplace(Mode::Answer);
    Start(true);
    // The writer goes right after the press, with the key down: the daemon
    // reads the press, and from then on every read ends at end of file; no
    // idle wait can come between them to step the volume again.
    const auto press = vt::KeyReport(kVolumeUpKey, 1);
    ASSERT_TRUE(fifo_->Write(press.data(), press.size()));
    const auto gone = std::chrono::steady_clock::now();
    fifo_.reset();
    ASSERT_TRUE(audio_->WaitForCount(1));
    ASSERT_TRUE(log_.WaitFor(kShortRead));
    Served(RC_ACT_PLAY, AUDIO_CMD_PLAY);  // the control socket is served meanwhile
    Pause(300);
    const int flood = log_.Count(kShortRead);
    const auto floodMs = std::chrono::duration_cast<std::chrono::milliseconds>(
        std::chrono::steady_clock::now() - gone).count();
    std::printf("receiver gone: %d short-read messages in %lld ms\n", flood,
                static_cast<long long>(floodMs));

    // Closing the receiver ends the messages.
    daemon_.Signal(SIGUSR2);
    ASSERT_TRUE(Receiving(std::string(kDevice) + " (deleted)", false));
    Pause(100);
    const int afterClose = log_.Count(kShortRead);
    Pause(400);
    EXPECT_EQ(log_.Count(kShortRead), afterClose) << "messages after the receiver was closed";

    // Back again: the key that was down must not step the volume on its own.
    fifo_.emplace(kDevice);
    daemon_.Signal(SIGUSR1);
    ASSERT_TRUE(Receiving(kDevice, true));
    Pause(1000);
    EXPECT_EQ(CountOf(audio_->Codes(), AUDIO_CMD_VOLUME_UP), 1u)
        << "the volume ran away; commands: " << Text(audio_->Codes()) << " after " << flood
        << " short reads";
    Tap(kPlayKey);
    ASSERT_TRUE(vt::WaitUntil([&] { return CountOf(audio_->Codes(), AUDIO_CMD_PLAY) == 2; }, 5000));

    // A device whose reads fail (as a real one that went away): silent, and
    // the control socket is still served.
    daemon_.Signal(SIGUSR2);
    ASSERT_TRUE(Receiving(kDevice, false));
    fifo_.reset();
    ASSERT_EQ(mkdir(kDevice, 0755), 0);
    daemon_.Signal(SIGUSR1);
    ASSERT_TRUE(Receiving(kDevice, true));
    const std::size_t before = log_.Lines().size();
    Served(RC_ACT_STOP, AUDIO_CMD_STOP);
    Pause(300);
    EXPECT_EQ(log_.Lines().size(), before) << log_.Dump();
    daemon_.Signal(SIGUSR2);
    ASSERT_TRUE(Receiving(kDevice, false));
    rmdir(kDevice);
}

TEST_F(Faults, HotplugSignalStormLosesNoActionAndNoKey)
{
    audio_.emplace(Mode::Answer);
    Start(true);
    std::optional<vt::HotplugStorm> storm;
    storm.emplace(daemon_.Pid());
    // Injected actions from one client, keys from the remote, at the same time.
    const std::vector<std::int32_t> actions = {RC_ACT_NEXT, RC_ACT_PREV, RC_ACT_CUSTOM1,
                                               RC_ACT_PLAYLIST};
    const std::vector<std::int32_t> commands = {AUDIO_CMD_NEXT, AUDIO_CMD_PREV, AUDIO_CMD_CUSTOM,
                                                AUDIO_CMD_PLAYLIST};
    std::vector<std::int32_t> injected;
    std::thread client([&] {
        for (int i = 0; i < 60; ++i) {
            const std::size_t k = static_cast<std::size_t>(i) % actions.size();
            if (!vt::InjectAction(actions[k]))
                return;
            injected.push_back(commands[k]);
        }
    });
    std::vector<std::int32_t> keyed;
    for (int i = 0; i < 20; ++i) {
        Tap(i % 2 == 0 ? kPlayKey : kStopKey);
        keyed.push_back(i % 2 == 0 ? AUDIO_CMD_PLAY : AUDIO_CMD_STOP);
    }
    client.join();
    storm.reset();
    ASSERT_TRUE(Receiving(kDevice, true));
    ASSERT_EQ(injected.size(), 60u) << "the daemon stopped taking actions";

    ASSERT_TRUE(audio_->WaitForCount(80)) << audio_->Codes().size();
    Pause(300);
    std::vector<std::int32_t> fromClient, fromKeys;
    for (std::int32_t code : audio_->Codes())
        (code == AUDIO_CMD_PLAY || code == AUDIO_CMD_STOP ? fromKeys : fromClient).push_back(code);
    EXPECT_EQ(fromClient, injected);
    EXPECT_EQ(fromKeys, keyed);
}

TEST_F(Faults, StuckControlClientsHoldTheSocketButNotTheReceiver)
{
    audio_.emplace(Mode::Answer);
    Start(true);
    std::vector<int> stuck;
    for (int i = 0; i < 4; ++i)
        stuck.push_back(vt::ConnectUnix("/tmp/vexoctrl"));
    Pause(1200);  // one accepted per poll, and a poll every 200 ms with the receiver open
    const int waiting = vt::SendAction(RC_ACT_PLAY);
    ASSERT_GE(waiting, 0);
    EXPECT_FALSE(vt::Readable(waiting, 1000)) << "a fifth client was served with every slot held";

    Tap(kStopKey);
    ASSERT_TRUE(audio_->WaitForCount(1));
    EXPECT_EQ(audio_->Codes(), (std::vector<std::int32_t> {AUDIO_CMD_STOP}));

    // The stuck clients give up: their slots free, the waiting action goes through.
    for (int fd : stuck)
        close(fd);
    EXPECT_TRUE(vt::Readable(waiting, 5000));
    close(waiting);
    ASSERT_TRUE(audio_->WaitForCount(2));
    EXPECT_EQ(audio_->Codes().back(), AUDIO_CMD_PLAY);

    // Stuck clients at shutdown do not hold the daemon up.
    for (int i = 0; i < 4; ++i)
        stuck[static_cast<std::size_t>(i)] = vt::ConnectUnix("/tmp/vexoctrl");
    Pause(1200);
    EXPECT_EQ(daemon_.Stop(SIGTERM, kStopMs), 0);
    for (int fd : stuck)
        close(fd);
}

// Mounts a file system of its own over /run (where /var/run points) for one
// test, and takes it away again.
class OwnRun {
public:
    explicit OwnRun(const char* options, unsigned long flags = 0)
    {
        mounted_ = mount("vexo-run-fault", "/run", "tmpfs", flags, options) == 0;
        EXPECT_TRUE(mounted_) << "mount over /run: " << std::strerror(errno);
    }
    ~OwnRun()
    {
        if (mounted_)
            umount2("/run", MNT_DETACH);
    }

private:
    bool mounted_ = false;
};

TEST_F(Faults, UnwritablePidFileIsLoggedAndTheDaemonServesOn)
{
    allowed_ = {"vexorcd.cpp (119) Failed to write vexorcd pid [/var/run/vexorcd.pid]. ("};
    audio_.emplace(Mode::Answer);
    {
        OwnRun readOnly("mode=0755", MS_RDONLY);
        ASSERT_GT(daemon_.Start(true, false), 0);
        ASSERT_TRUE(log_.WaitFor("(Read-only file system)")) << log_.Dump();
        Served(RC_ACT_PLAY, AUDIO_CMD_PLAY);
        EXPECT_EQ(daemon_.Stop(SIGTERM, kStopMs), 0);
    }
    {
        // Full: the file can be created, but its pid cannot be written. It
        // stays empty and locked: a second start is still refused.
        OwnRun full("size=4k,mode=0755");
        vt::WriteFile("/run/filler", std::string(4096, 'x'));
        ASSERT_GT(daemon_.Start(true, false), 0);
        Served(RC_ACT_STOP, AUDIO_CMD_STOP);
        EXPECT_EQ(vt::ReadFile(kPidFile), "");
        EXPECT_TRUE(log_.WaitFor("(No space left on device)", 1000)) << log_.Dump();
        std::string out;
        EXPECT_EQ(vt::RunToEnd({vt::BinPath("vexorcd")}, &out), 0);
        EXPECT_EQ(out, "vexorcd already exists. pid[0]\n");
        EXPECT_EQ(vt::FindAdoptedChild(daemon_.Pid()), 0) << "a second daemon";
        EXPECT_EQ(daemon_.Stop(SIGTERM, kStopMs), 0);
        EXPECT_FALSE(vt::PathExists(kPidFile));
    }
    // A symlink at the path is not followed: the daemon runs on without a
    // pid file and leaves the link and its target alone.
    vt::WriteFile("/tmp/precious", "keep");
    ASSERT_EQ(symlink("/tmp/precious", kPidFile), 0);
    ASSERT_GT(daemon_.Start(true, false), 0);
    ASSERT_TRUE(log_.WaitFor("(Too many levels of symbolic links)")) << log_.Dump();
    Served(RC_ACT_PLAY, AUDIO_CMD_PLAY);
    EXPECT_EQ(daemon_.Stop(SIGTERM, kStopMs), 0);
    struct stat st {};
    EXPECT_TRUE(lstat(kPidFile, &st) == 0 && S_ISLNK(st.st_mode));
    EXPECT_EQ(vt::ReadFile("/tmp/precious"), "keep");
}

}  // namespace
