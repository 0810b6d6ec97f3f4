// The audio daemon client against the tools' stand-in audio daemon, run on a
// thread: the exchange and its faults, every argument form byte for byte, the
// refusals, and the command each remote action sends.
#include <pthread.h>

#include <atomic>
#include <climits>
#include <cstring>
#include <mutex>
#include <optional>

#include "audioctl/ctrl.hpp"
#include "audioctl/playlist.hpp"
#include "harness.hpp"
#include "lib/audio_peer.hpp"
#include "vexorcd/dispatch.hpp"

namespace {

const std::string NO_PEER = "ctrl.cpp:27 Failed to connect to /tmp/vexoaudiod.sock. [No such file or directory]";

// The tools' stand-in audio daemon on a thread, in a mode, keeping each record it takes.
class Peer {
    std::mutex mu_;
    std::string records_;
    AudioPeer peer_;  // stopped before the records go

public:
    explicit Peer(AudioPeerMode mode = AudioPeerMode::Answer, int delayMs = 0)
    {
        std::string error;
        EXPECT_TRUE(peer_.Listen(&error)) << error;
        peer_.SetMode(mode, delayMs);
        peer_.SetObserver([this](const AudioPeerRecord& seen) {
            const std::lock_guard<std::mutex> lock(mu_);
            records_.append(reinterpret_cast<const char*>(&seen.record), seen.bytes);
        });
        EXPECT_TRUE(peer_.Start());
    }
    // The bytes of the records it took so far.
    std::string Records()
    {
        const std::lock_guard<std::mutex> lock(mu_);
        return records_;
    }
};

// A record as it must arrive: the code in this machine's byte order, the argument, zeros.
std::string Wire(std::int32_t code, const std::string& arg)
{
    std::string wire(sizeof(AudioCmdRecord), '\0');
    std::memcpy(wire.data(), &code, 4);
    return wire.replace(4, arg.size(), arg);
}

TEST(AudioExchange, OneRecordOutAndOneAnswerInWithinTheBudget)
{
    vt::Logged();
    const std::string cleared(32, '\0'), untouched(32, 'x'), ok = std::string(cleared).replace(0, 2, "ok");
    using Mode = AudioPeerMode;
    const struct {  // the peer (if any) and its delay, and what the exchange gives, takes and leaves
        std::optional<Mode> mode;
        int delayMs, result, minMs, maxMs;
        std::string reply;
        std::vector<std::string> log;
    } rows[] = {
        {Mode::Answer, 0, 0, 0, 400, ok, {}},  // the rest of the buffer is cleared
        {Mode::AnswerHuge, 0, 0, 0, 400, std::string(32, 'h'), {}},
        {Mode::AnswerLate, 200, 0, 150, 450, ok, {}},         // within the budget
        {Mode::AnswerLate, 1500, -1, 480, 1000, untouched, {}},  // given up after the budget
        {Mode::CloseWithoutAnswer, 0, -1, 0, 400, cleared, {"ctrl.cpp:90 Failed to read action [Success]"}},
        {std::nullopt, 0, -1, 0, 400, untouched, {NO_PEER}},
    };
    for (const auto& r : rows) {
        std::optional<Peer> peer;
        if (r.mode)
            peer.emplace(*r.mode, r.delayMs);
        char reply[40];
        std::memset(reply, 'x', sizeof reply);
        const auto start = std::chrono::steady_clock::now();
        EXPECT_EQ(AudioCtrlTransact(AudioCmdRecord {}, reply, 32), r.result);
        const auto ms = (std::chrono::steady_clock::now() - start) / std::chrono::milliseconds(1);
        EXPECT_TRUE(ms >= r.minMs && ms < r.maxMs) << ms << " ms for a result of " << r.result;
        EXPECT_EQ(std::string(reply, sizeof reply), r.reply + "xxxxxxxx");
        EXPECT_EQ(vt::Logged(), r.log);
    }
}

TEST(AudioExchange, HotPlugSignalsDuringAConnectThatWaitsForRoomDoNotLoseTheCommand)
{
    vt::Logged();
    struct sigaction quiet {};  // restarting, as the daemon's: the send time-out still ends the connect
    quiet.sa_handler = [](int) {}, quiet.sa_flags = SA_RESTART;
    ASSERT_EQ(sigaction(SIGUSR1, &quiet, nullptr), 0);
    AudioPeer peer;  // listening, its queue full, serving only after 200 ms: the connect waits
    std::string error;
    ASSERT_TRUE(peer.Listen(&error, 0)) << error;
    std::vector<int> queued;
    for (int fd; (fd = UnixConnect(AUDIO_SOCKET_PATH, SOCK_STREAM, 1, nullptr)) >= 0;)
        queued.push_back(fd);
    std::atomic<bool> done {false};
    std::thread storm([&, client = pthread_self()] {
        for (int ms = 0; !done; ms += 5, usleep(5000))
            if (pthread_kill(client, SIGUSR1) == 0 && ms == 200) {
                std::for_each(queued.begin(), queued.end(), close);
                peer.Start();
            }
    });
    char reply[8];
    EXPECT_TRUE(!queued.empty() && AudioCtrlTransact(AudioCmdRecord {}, reply, sizeof reply) == 0);
    done = true;
    storm.join();
    EXPECT_EQ(vt::Logged(), std::vector<std::string> {});
}

TEST(AudioForms, EveryArgumentFormArrivesByteForByteAndRefusalsSendNothing)
{
    vt::Logged();
    AudioPlaylistRecord record;
    for (std::size_t i = 0; i < sizeof record; ++i)  // every byte unlike its neighbours
        reinterpret_cast<unsigned char*>(&record)[i] = static_cast<unsigned char>(i % 251 + 1);
    const std::string bytes(reinterpret_cast<const char*>(&record), sizeof record);
    const std::int32_t n = 0x01020304;
    const std::string withN = std::string(bytes).replace(6832, 4, reinterpret_cast<const char*>(&n), 4);
    const float bands[AUDIO_EQ_BANDS] = {0, 1.5f, -2, 12, -0.3f, 7, 100, -12.5f, 2.26f, 10};
    const std::pair<std::function<std::int32_t()>, std::string> rows[] = {
        {[] { return AudioCtrlSendBare(AUDIO_CMD_PLAY); }, Wire(4, "")},
        {[] { return AudioCtrlSendInt(AUDIO_CMD_8, -5); }, Wire(8, "-5")},
        {[] { return AudioCtrlSendInt(AUDIO_CMD_CUSTOM_HELD, INT32_MIN); }, Wire(36, "-2147483648")},
        {[] { return AudioCtrlSendInt(AUDIO_CMD_21, 0); }, Wire(21, "0")},
        {[] { return AudioCtrlSendInt(AUDIO_CMD_24, -3); }, Wire(24, "-3")},
        {[&] { return AudioCtrlSendRecord(AUDIO_CMD_20, &record); }, Wire(20, bytes)},
        {[&] { return AudioCtrlSendRecordInt(AUDIO_CMD_23, n, &record); }, Wire(23, withN)},
        {[&] { return AudioCtrlSetEqBands(bands); }, Wire(35, "0.0 1.5 -2.0 12.0 -0.3 7.0 100.0 -12.5 2.3 10.0")},
    };
    for (const auto& [send, wire] : rows) {
        Peer peer;
        EXPECT_EQ(send(), 0);
        EXPECT_TRUE(peer.Records() == wire) << "command " << (wire[0] | wire[3]);  // the code's byte, either order
    }
    char reply[8] = "keep";
    EXPECT_EQ(AudioCtrlTransact(AudioCmdRecord {}, nullptr, 8192), -1);
    EXPECT_EQ(AudioCtrlTransact(AudioCmdRecord {}, reply, 0), -1);
    EXPECT_EQ(AudioCtrlTransact(AudioCmdRecord {}, reply, -1), -1);
    EXPECT_STREQ(reply, "keep");
    EXPECT_EQ(AudioCtrlSendInt(AUDIO_CMD_21, -1), -1);
    EXPECT_EQ(AudioCtrlSendRecord(AUDIO_CMD_20, nullptr), -1);
    EXPECT_EQ(AudioCtrlSendRecordInt(AUDIO_CMD_23, 5, nullptr), -1);
    EXPECT_EQ(AudioCtrlSendRecordInt(AUDIO_CMD_23, 7, &record), -1);  // nobody listens: only this one connects
    EXPECT_EQ(record.n, 7);  // and the integer is in the caller's record all the same
    const std::string bad = "ctrl.cpp:46 Bad parameter";
    EXPECT_EQ(vt::Logged(), (std::vector<std::string> {bad, bad, bad, "playlist.cpp:55 Bad parameter",
                                                       "playlist.cpp:26 Bad parameter",
                                                       "playlist.cpp:105 Bad parameter", NO_PEER}));
}

TEST(Dispatch, EveryActionSendsItsCommandAndTheOthersNothing)
{
    vt::Logged();
    // Actions 1 to 25: the command (0: none, and then nobody listens) and its argument.
    const std::pair<std::int32_t, const char*> commands[] = {
        {0, ""},  {5, ""},  {1, ""},  {2, ""},   {3, ""},   {4, ""},   {6, ""},   {7, ""},   {12, ""},
        {13, ""}, {0, ""},  {0, ""},  {26, ""},  {30, ""},  {31, ""},  {32, "1"}, {32, "2"}, {32, "3"},
        {32, "4"}, {33, ""}, {34, ""}, {36, "1"}, {36, "2"}, {36, "3"}, {36, "4"}};
    for (RcAction action = 1; action <= 25; ++action) {
        const auto& [code, arg] = commands[action - 1];
        std::optional<Peer> peer;
        if (code != 0)
            peer.emplace();
        EXPECT_EQ(RcDispatchAction(action), 0) << action;
        EXPECT_TRUE(!peer || peer->Records() == Wire(code, arg)) << "action " << action;
    }
    for (const RcAction action : {0, 26, -1})
        EXPECT_EQ(RcDispatchAction(action), 0);
    EXPECT_TRUE(vt::Logged().empty());
}

}  // namespace
