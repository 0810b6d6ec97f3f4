// The radio receiver driver: the key-hold decisions driven step by step, and
// the read around them over a pipe and a FIFO.
#include <fcntl.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "drivers/hw_raytac.hpp"
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
    vt::SyslogSink log_;
    int pipe_[2] = {-1, -1};
};

TEST_F(RaytacReading, BadReportsAreLoggedDroppedAndLeaveTheStateAlone)
{
    Send(VOLUME_PLUS, 1);
    ASSERT_EQ(RaytacRead(), RC_ACT_VOLUME_UP);
    const RaytacHoldState before = RaytacHold;
    const auto expectDropped = [&](const std::string& message) {
        EXPECT_EQ(RaytacRead(), -1) << message;
        if (!message.empty()) {
            EXPECT_TRUE(log_.WaitFor(message, 2000)) << log_.Dump();
        }
        EXPECT_EQ(std::memcmp(&RaytacHold, &before, sizeof before), 0) << message;
    };
    // Each one carries a Play press where a report's key would be.
    Send(PLAY, 1, 80);
    expectDropped("hw_raytac.cpp (311) The hid response is too short. ret:80 (10)");
    Send(PLAY, 1, 144);  // two reports at once are dropped too
    expectDropped("hw_raytac.cpp (311) The hid response is too short. ret:144 (18)");
    Send(PLAY, 1, 7);
    expectDropped("hw_raytac.cpp (304) Got short read from device!");
    EXPECT_EQ(log_.Lines().size(), 3u) << log_.Dump();

    // A failing read is silent.
    const int dir = open("/tmp", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    ASSERT_GE(dir, 0);
    raytac.descriptor = dir;
    expectDropped("");
    close(dir);
    usleep(100000);
    EXPECT_EQ(log_.Lines().size(), 3u) << log_.Dump();
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
