// The audio daemon client against a peer of the test's own on the audio
// daemon's socket: the exchange and its faults, every argument form byte for
// byte, the refusals, and the command each remote action sends.
#include <climits>
#include <thread>
#include <cstring>
#include <optional>

#include "audioctl/ctrl.hpp"
#include "audioctl/playlist.hpp"
#include "harness.hpp"
#include "vexorcd/dispatch.hpp"

namespace {

const std::string NO_PEER = "ctrl.cpp:27 Failed to connect to /tmp/vexoaudiod.sock. [No such file or directory]";

// The far end of one exchange, in a thread: takes the record, then after
// delayMs answers `answer` bytes, or hangs up without a word when answer is 0.
class Peer {
    int listener_ = vt::UnixSocket(AUDIO_SOCKET_PATH, SOCK_STREAM, true);
    std::string record_;
    std::thread thread_;

public:
    explicit Peer(std::size_t answer = 1, int delayMs = 0)
    {
        listen(listener_, 4);
        thread_ = std::thread([this, answer, delayMs] {
            pollfd ready {listener_, POLLIN, 0};
            const int fd = poll(&ready, 1, 2000) == 1 ? accept(listener_, nullptr, nullptr) : -1;
            char chunk[4096];
            ssize_t n = 1;
            while (fd >= 0 && n > 0 && record_.size() < sizeof(AudioCmdRecord))
                if ((n = read(fd, chunk, sizeof chunk)) > 0)
                    record_.append(chunk, static_cast<std::size_t>(n));
            std::this_thread::sleep_for(std::chrono::milliseconds(fd >= 0 ? delayMs : 0));
            send(fd, std::string(answer, 'r').data(), answer, MSG_NOSIGNAL);
            close(fd);
        });
    }
    ~Peer() { Record(); }
    // What it received; empty when nobody came.
    const std::string& Record()
    {
        if (thread_.joinable()) {
            thread_.join();
            close(listener_);
            unlink(AUDIO_SOCKET_PATH);
        }
        return record_;
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
    const std::string cleared(32, '\0'), untouched(32, 'x');
    std::string one = cleared;
    one[0] = 'r';
    const struct {  // the peer and what it does, what the exchange gives, takes and leaves
        bool peer;
        std::size_t answer;
        int delayMs, result, minMs, maxMs;
        std::string reply;
        std::vector<std::string> log;
    } rows[] = {
        {true, 1, 0, 0, 0, 400, one, {}},  // the rest of the buffer is cleared
        {true, 100, 0, 0, 0, 400, std::string(32, 'r'), {}},
        {true, 1, 200, 0, 150, 450, one, {}},           // late, within the budget
        {true, 0, 1500, -1, 480, 1000, untouched, {}},  // silent: given up after the budget
        {true, 0, 0, -1, 0, 400, cleared, {"ctrl.cpp:90 Failed to read action [Success]"}},
        {false, 0, 0, -1, 0, 400, untouched, {NO_PEER}},
    };
    for (const auto& r : rows) {
        std::optional<Peer> peer;
        if (r.peer)
            peer.emplace(r.answer, r.delayMs);
        char reply[40];
        std::memset(reply, 'x', sizeof reply);
        const auto start = std::chrono::steady_clock::now();
        EXPECT_EQ(AudioCtrlTransact(AudioCmdRecord {}, reply, 32), r.result);
        const auto ms = (std::chrono::steady_clock::now() - start) / std::chrono::milliseconds(1);
        EXPECT_TRUE(ms >= r.minMs && ms < r.maxMs) << ms << " ms for " << r.answer << " after " << r.delayMs;
        EXPECT_EQ(std::string(reply, sizeof reply), r.reply + "xxxxxxxx");
        EXPECT_EQ(vt::Logged(), r.log);
    }
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
        std::int32_t code;
        std::memcpy(&code, wire.data(), 4);
        EXPECT_TRUE(peer.Record() == wire) << "command " << code;
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
        EXPECT_TRUE(!peer || peer->Record() == Wire(code, arg)) << "action " << action;
    }
    for (const RcAction action : {0, 26, -1})
        EXPECT_EQ(RcDispatchAction(action), 0);
    EXPECT_TRUE(vt::Logged().empty());
}

}  // namespace
