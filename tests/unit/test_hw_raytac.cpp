// The radio receiver driver: the key-hold decisions driven step by step, and
// the read around them over a pipe and a FIFO.
#include <fcntl.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "drivers/hw_raytac.hpp"
#include "fault_kit.hpp"
#include "harness.hpp"
#include "remote.hpp"

namespace {

constexpr std::uint32_t PLAY = 0x0007002C;
constexpr std::uint32_t NEXT = 0x00070011;
constexpr std::uint32_t VOLUME_PLUS = 0x00070057;
constexpr std::uint32_t UNMAPPED = 0x00070004;  // the letter a

RaytacEvent Press(std::uint32_t code) { return {false, {code, 1}}; }
RaytacEvent Release(std::uint32_t code, std::int32_t value = 0) { return {false, {code, value}}; }
const RaytacEvent IDLE {true, {0, 0}};

// One step: the action handed over and the code offered (0: none).
void Step(RaytacHoldState& s, const RaytacEvent& e, RcAction action, std::uint32_t offered,
          const std::string& where)
{
    const RaytacHandOver h = RaytacStep(s, e);
    EXPECT_EQ(h.action, action) << where;
    EXPECT_EQ(h.offer ? h.code : 0u, offered) << where;
}

TEST(RaytacStep, EveryMappedKeyActsAsItsClassSays)
{
    const std::vector<std::pair<std::uint32_t, RcAction>> keys = {
        {0x0007004F, 2}, {0x00070053, 2}, {0x00070051, 4},  {0x00070052, 5},  {0x0007002C, 6},
        {0x00070011, 7}, {0x00070013, 8}, {0x00070057, 9},  {0x00070056, 10}, {0x00070058, 13},
        {0x00070059, 14}, {0x00070050, 15}, {0x00070049, 3}, {0x00070061, 16}, {0x00070062, 17},
        {0x00070063, 18}, {0x00070064, 19}};
    ASSERT_EQ(RaytacKeyMap[RAYTAC_KEY_COUNT].label, nullptr);
    for (const auto& [code, action] : keys) {
        const std::string key = "key " + std::to_string(code & 0xFF);
        RaytacHoldState s {};
        if (RcActionHasLongPress(action)) {
            // Released after 0 to 3 idle waits: the short action at the release.
            for (int idles = 0; idles <= 3; ++idles) {
                Step(s, Press(code), 0, code, key + " press");
                for (int i = 0; i < idles; ++i)
                    Step(s, IDLE, 0, code, key + " short idle");
                Step(s, Release(code), action, code, key + " short release");
                Step(s, IDLE, 0, 0, key + " after short");
            }
            // Held: the held variant once, on the fourth idle wait; nothing at the release.
            Step(s, Press(code), 0, code, key + " press");
            for (int i = 0; i < 3; ++i)
                Step(s, IDLE, 0, code, key + " long idle");
            Step(s, IDLE, RcActionHeldVariant(action), code, key + " held");
            Step(s, IDLE, 0, 0, key + " after held");
            Step(s, Release(code), 0, 0, key + " release after held");
        } else {
            // Volume keys repeat on every idle wait; other keys act at the press only.
            const RcAction repeat = RcActionIsVolume(action) ? action : 0;
            Step(s, Press(code), action, code, key + " press");
            for (int i = 0; i < 5; ++i)
                Step(s, IDLE, repeat, code, key + " idle while down");
            Step(s, Release(code), 0, 0, key + " release");
        }
        Step(s, IDLE, 0, 0, key + " after release");
        EXPECT_EQ(s.lastCode, 0u) << key;
    }
    EXPECT_EQ(RcActionHeldVariant(RC_ACT_PREV), RC_ACT_PREV_HELD);
    EXPECT_EQ(RcActionHeldVariant(RC_ACT_CUSTOM4), RC_ACT_CUSTOM4_HELD);
}

TEST(RaytacStep, UnmappedKeysOddValuesAndOverlappingKeys)
{
    RaytacHoldState s {};
    Step(s, IDLE, 0, 0, "idle with nothing down");
    Step(s, Release(PLAY), 0, 0, "release with nothing down");
    Step(s, Press(UNMAPPED), RC_ACT_UNMAPPED, UNMAPPED, "unmapped press");
    Step(s, IDLE, 0, UNMAPPED, "unmapped held");
    Step(s, Release(UNMAPPED), 0, 0, "unmapped release");
    // Only 1 is a press: 2 (a keyboard's auto-repeat) and -1 release the key.
    for (const std::int32_t value : {2, -1}) {
        Step(s, Press(VOLUME_PLUS), RC_ACT_VOLUME_UP, VOLUME_PLUS, "volume press");
        Step(s, Release(VOLUME_PLUS, value), 0, 0, "odd value");
        Step(s, IDLE, 0, 0, "no repeat after odd value");
    }
    // Another key pressed while Next is down takes over: no Next at all.
    Step(s, Press(NEXT), 0, NEXT, "next press");
    Step(s, Press(PLAY), RC_ACT_PLAY, PLAY, "play over next");
    Step(s, Release(PLAY), 0, 0, "play release");
}

class RaytacReading : public ::testing::Test {
protected:
    void SetUp() override
    {
        ASSERT_EQ(pipe2(pipe_, O_CLOEXEC), 0);
        raytac.descriptor = pipe_[0];
        RaytacHold = RaytacHoldState {};
    }
    void TearDown() override
    {
        raytac.descriptor = -1;
        close(pipe_[0]);
        close(pipe_[1]);
    }
    // Writes reports of one key event, cut or repeated to size bytes.
    void Send(std::uint32_t code, std::int32_t value, size_t size = sizeof(RaytacReport)) const
    {
        RaytacReport r {};
        r.events[RAYTAC_KEY_EVENT] = {code, value};
        std::vector<unsigned char> bytes(size);
        for (size_t i = 0; i < size; ++i)
            bytes[i] = reinterpret_cast<const unsigned char*>(&r)[i % sizeof r];
        ASSERT_EQ(write(pipe_[1], bytes.data(), size), static_cast<ssize_t>(size));
    }
    // Writes whole reports, one key event each, in one piece.
    void SendTogether(const std::vector<hiddev_event>& keys) const
    {
        std::vector<RaytacReport> reports(keys.size());
        for (size_t i = 0; i < keys.size(); ++i)
            reports[i].events[RAYTAC_KEY_EVENT] = keys[i];
        const size_t size = reports.size() * sizeof(RaytacReport);
        ASSERT_EQ(write(pipe_[1], reports.data(), size), static_cast<ssize_t>(size));
    }
    int Unread() const
    {
        int n = -1;
        ioctl(pipe_[0], FIONREAD, &n);
        return n;
    }
    vt::SyslogSink log_;
    int pipe_[2] = {-1, -1};
};

TEST_F(RaytacReading, ReportsReadTogetherAreHandledOneByOneInOrder)
{
    constexpr std::uint32_t STOP = 0x0007004F;
    struct Row {
        const char* what;
        bool volumeDown;                  // Volume Plus pressed (and read) first
        std::vector<hiddev_event> keys;   // written in one piece
        std::vector<std::int32_t> reads;  // results of the reads that follow, idle waits included
    };
    const std::vector<Row> rows = {
        // A release lost with its read would leave the volume running away.
        {"release and press", true, {{VOLUME_PLUS, 0}, {STOP, 1}}, {0, RC_ACT_STOP, 0, 0}},
        {"three reports", false, {{PLAY, 1}, {PLAY, 0}, {NEXT, 1}}, {RC_ACT_PLAY, 0, 0, 0}},
        // Seven reports fit one read; the eighth comes whole with the next.
        {"eight reports", false,
         {{PLAY, 1}, {PLAY, 0}, {PLAY, 1}, {PLAY, 0}, {PLAY, 1}, {PLAY, 0}, {NEXT, 1}, {NEXT, 0}},
         {RC_ACT_PLAY, 0, RC_ACT_PLAY, 0, RC_ACT_PLAY, 0, 0, RC_ACT_NEXT, 0}},
    };
    for (const Row& row : rows) {
        RaytacHold = RaytacHoldState {};
        if (row.volumeDown) {
            Send(VOLUME_PLUS, 1);
            ASSERT_EQ(RaytacRead(), RC_ACT_VOLUME_UP) << row.what;
        }
        SendTogether(row.keys);
        std::vector<std::int32_t> got;
        for (size_t i = 0; i < row.reads.size(); ++i) {
            got.push_back(RaytacRead());
            if (i == 0) {  // one read took every report that fits
                EXPECT_EQ(Unread(), row.keys.size() > 7 ? 72 : 0) << row.what;
            }
        }
        EXPECT_EQ(got, row.reads) << row.what;
    }
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
}

TEST_F(RaytacReading, BadReadsAreLoggedDroppedAndEndAnyHold)
{
    // Each one carries a Play press where a report's key would be, and comes
    // while Volume Plus is held: it may have held the release.
    const std::vector<std::pair<size_t, std::string>> bad = {
        {80, "hw_raytac.cpp (311) The hid response is too short. ret:80 (10)"},
        {150, "hw_raytac.cpp (311) The hid response is too short. ret:150 (18)"},
        {7, "hw_raytac.cpp (304) Got short read from device!"},
    };
    for (const auto& [size, message] : bad) {
        Send(VOLUME_PLUS, 1);
        ASSERT_EQ(RaytacRead(), RC_ACT_VOLUME_UP);
        Send(PLAY, 1, size);
        EXPECT_EQ(RaytacRead(), -1) << size;
        EXPECT_TRUE(log_.WaitFor(message, 2000)) << log_.Dump();
        EXPECT_EQ(RaytacHold.heldAction, RC_ACT_NONE) << size;
        EXPECT_EQ(RaytacHold.lastCode, 0u) << size;
        EXPECT_EQ(RaytacRead(), 0) << "the volume repeats after a dropped read of " << size;
    }
    EXPECT_EQ(log_.Lines().size(), 3u) << log_.Dump();

    // A failing read is silent and changes nothing.
    Send(VOLUME_PLUS, 1);
    ASSERT_EQ(RaytacRead(), RC_ACT_VOLUME_UP);
    const RaytacHoldState before = RaytacHold;
    const int dir = open("/tmp", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    ASSERT_GE(dir, 0);
    raytac.descriptor = dir;
    EXPECT_EQ(RaytacRead(), -1);
    EXPECT_EQ(std::memcmp(&RaytacHold, &before, sizeof before), 0);
    close(dir);
    usleep(100000);
    EXPECT_EQ(log_.Lines().size(), 3u) << log_.Dump();
}

TEST_F(RaytacReading, ASignalResumesTheWaitUnlessTheDaemonIsStopping)
{
    // Next held for 300 ms under a storm: the waits resume, so it is a short press.
    Send(NEXT, 1);
    ASSERT_EQ(RaytacRead(), 0);
    std::vector<std::int32_t> during;
    {
        vt::ThreadSignalStorm storm;
        const auto start = std::chrono::steady_clock::now();
        while (std::chrono::steady_clock::now() - start < std::chrono::milliseconds(300))
            during.push_back(RaytacRead());
    }
    EXPECT_LE(during.size(), 2u) << "waits cut short by signals";
    EXPECT_EQ(std::count(during.begin(), during.end(), RC_ACT_NEXT_HELD), 0);
    Send(NEXT, 0);
    EXPECT_EQ(RaytacRead(), RC_ACT_NEXT);

    // Stopping: a signal ends the wait, and a held volume key does not step.
    Send(VOLUME_PLUS, 1);
    ASSERT_EQ(RaytacRead(), RC_ACT_VOLUME_UP);
    HiddevStopWaiting = [] { return true; };
    {
        vt::ThreadSignalStorm storm;
        const auto start = std::chrono::steady_clock::now();
        EXPECT_EQ(RaytacRead(), 0);
        EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(150));
    }
    HiddevStopWaiting = nullptr;
}

TEST(RaytacDriver, OpenClearsTheHoldStateOnlyOnARealOpenAndCloseKeepsIt)
{
    vt::SyslogSink log;
    raytac.descriptor = -1;
    const RaytacHoldState volumeDown {VOLUME_PLUS, 0, RC_ACT_VOLUME_UP};
    {
        vt::ReceiverFifo fifo;
        RaytacHold = volumeDown;
        ASSERT_EQ(RaytacOpen(), 0);
        const int fd = raytac.descriptor;
        EXPECT_GE(fd, 0);
        // The volume key that was down when the receiver went away is forgotten.
        EXPECT_EQ(RaytacHold.heldAction, RC_ACT_NONE);
        EXPECT_EQ(RaytacHold.lastCode, 0u);
        EXPECT_EQ(RaytacRead(), RC_ACT_NONE);  // an idle wait: no runaway step

        RaytacHold = volumeDown;
        EXPECT_EQ(RaytacOpen(), 0);  // already open: nothing changes
        EXPECT_EQ(raytac.descriptor, fd);
        EXPECT_EQ(RaytacHold.heldAction, RC_ACT_VOLUME_UP);

        EXPECT_EQ(RaytacClose(), 0);
        EXPECT_EQ(raytac.descriptor, -1);
        EXPECT_EQ(RaytacHold.heldAction, RC_ACT_VOLUME_UP);  // close keeps it
        EXPECT_EQ(RaytacClose(), 0);

        // Reports read together and not yet handed out go with the device.
        ASSERT_EQ(RaytacOpen(), 0);
        RaytacReport two[2] = {};
        two[0].events[RAYTAC_KEY_EVENT] = {PLAY, 1};
        two[1].events[RAYTAC_KEY_EVENT] = {0x0007004F, 1};  // Stop
        ASSERT_TRUE(fifo.Write(two, sizeof two));
        EXPECT_EQ(RaytacRead(), RC_ACT_PLAY);
        EXPECT_EQ(RaytacClose(), 0);
        ASSERT_EQ(RaytacOpen(), 0);
        EXPECT_EQ(RaytacRead(), RC_ACT_NONE);  // an idle wait, not the Stop
        EXPECT_EQ(RaytacClose(), 0);
    }
    // No device: -1, silently, and the closed driver's reads return at once.
    EXPECT_EQ(RaytacOpen(), -1);
    const auto start = std::chrono::steady_clock::now();
    for (int i = 0; i < 10; ++i)
        EXPECT_EQ(RaytacRead(), 0);
    // Ten reads that waited would take two seconds.
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(1500));
    usleep(100000);
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
    RaytacHold = RaytacHoldState {};
}

std::string Print(const std::int32_t* version, const hiddev_devinfo* info)
{
    char buf[512] = {};
    std::FILE* f = fmemopen(buf, sizeof buf, "w");
    HiddevPrint(f, version, info);
    std::fclose(f);
    return buf;
}

TEST(HiddevDescribe, PrintsVersionAndIdentityWithSignedFields)
{
    const std::int32_t version = 0x010004;
    hiddev_devinfo info {};
    info.busnum = 3;
    info.devnum = 7;
    info.ifnum = 1;
    info.vendor = 0x05AC;
    info.product = static_cast<std::int16_t>(0x8242);  // negative as a signed field
    info.version = 0x0100;
    info.num_applications = 1;
    EXPECT_EQ(Print(&version, &info),
              "hiddev driver version is 1.0.4\n"
              "vendor 0x05ac product 0xffff8242 version 0x0100 has 1 application "
              "and is on bus: 3 devnum: 7 ifnum: 1\n");
    info.num_applications = 2;
    EXPECT_NE(Print(&version, &info).find("has 2 applications and"), std::string::npos);
    // A device that answers neither request (a FIFO standing in, say).
    EXPECT_EQ(Print(nullptr, nullptr),
              "hiddev driver version is unknown\nhiddev device information is unavailable\n");
}

}  // namespace
