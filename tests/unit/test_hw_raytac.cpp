// The radio receiver driver: the key-hold decisions driven step by step, and
// the read around them over a pipe, with and without a media-center listener.
#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "common/socket.hpp"
#include "drivers/hw_raytac.hpp"
#include "harness.hpp"
#include "remote.hpp"
#include "unix_client.hpp"

namespace {

constexpr std::uint32_t PLAY = 0x0007002C;
constexpr std::uint32_t NEXT = 0x00070011;
constexpr std::uint32_t VOLUME_PLUS = 0x00070057;
constexpr std::uint32_t UNMAPPED = 0x00070004;  // the letter a

RaytacEvent Press(std::uint32_t code) { return {false, {code, 1}}; }
RaytacEvent Release(std::uint32_t code, std::int32_t value = 0) { return {false, {code, value}}; }
const RaytacEvent IDLE {true, {0, 0}};

// One step: what is handed over, and which code is offered (0: none).
void ExpectStep(RaytacHoldState& s, const RaytacEvent& e, RcAction action, std::uint32_t offered,
                const std::string& where)
{
    const RaytacHandOver h = RaytacStep(s, e);
    EXPECT_EQ(h.action, action) << where;
    EXPECT_EQ(h.offer, offered != 0) << where;
    if (offered != 0) {
        EXPECT_EQ(h.code, offered) << where;
    }
}

TEST(RaytacStep, EveryMappedKeyActsAsItsClassSays)
{
    // The receiver's keys as the remote labels them; both Stop keys give Stop.
    const std::vector<std::pair<std::uint32_t, RcAction>> keys = {
        {0x0007004F, 2}, {0x00070053, 2}, {0x00070051, 4},  {0x00070052, 5},  {0x0007002C, 6},
        {0x00070011, 7}, {0x00070013, 8}, {0x00070057, 9},  {0x00070056, 10}, {0x00070058, 13},
        {0x00070059, 14}, {0x00070050, 15}, {0x00070049, 3}, {0x00070061, 16}, {0x00070062, 17},
        {0x00070063, 18}, {0x00070064, 19}};
    ASSERT_EQ(RaytacKeyMap[RAYTAC_KEY_COUNT].label, nullptr);
    for (const auto& [code, action] : keys) {
        const std::string where = "key " + std::to_string(code & 0xFF);
        const RcKeyEntry* e = RaytacKeyFind(code);
        ASSERT_NE(e, nullptr) << where;
        EXPECT_EQ(e->action, action) << where;
        RaytacHoldState s {};
        if (RcActionHasLongPress(action)) {
            // Short presses, released after 0 to 3 idle waits: the action at the
            // release, the code offered at every step.
            for (int idles = 0; idles <= 3; ++idles) {
                ExpectStep(s, Press(code), 0, code, where + " press");
                for (int i = 0; i < idles; ++i)
                    ExpectStep(s, IDLE, 0, code, where + " short idle");
                ExpectStep(s, Release(code), action, code, where + " short release");
                ExpectStep(s, IDLE, 0, 0, where + " after short");
            }
            // A long press: the held variant once, on the fourth idle wait.
            ExpectStep(s, Press(code), 0, code, where + " press");
            for (int i = 0; i < 3; ++i)
                ExpectStep(s, IDLE, 0, code, where + " long idle");
            ExpectStep(s, IDLE, RcActionHeldVariant(action), code, where + " held");
            ExpectStep(s, IDLE, 0, 0, where + " after held");
            ExpectStep(s, Release(code), 0, 0, where + " release after held");
            EXPECT_EQ(s.lastCode, 0u) << where;
        } else if (RcActionIsVolume(action)) {
            ExpectStep(s, Press(code), action, code, where + " press");
            for (int i = 0; i < 6; ++i)
                ExpectStep(s, IDLE, action, code, where + " repeat");
            ExpectStep(s, Release(code), 0, 0, where + " release");
            ExpectStep(s, IDLE, 0, 0, where + " after release");
        } else {
            ExpectStep(s, Press(code), action, code, where + " press");
            ExpectStep(s, IDLE, 0, code, where + " held");
            ExpectStep(s, Release(code), 0, 0, where + " release");
            ExpectStep(s, IDLE, 0, 0, where + " after release");
        }
        EXPECT_EQ(s.heldAction, 0) << where;
    }
    EXPECT_EQ(RcActionHeldVariant(RC_ACT_PREV), RC_ACT_PREV_HELD);
    EXPECT_EQ(RcActionHeldVariant(RC_ACT_CUSTOM4), RC_ACT_CUSTOM4_HELD);
}

TEST(RaytacStep, UnmappedKeysAndOddValues)
{
    RaytacHoldState s {};
    ExpectStep(s, IDLE, 0, 0, "idle with nothing down");
    ExpectStep(s, Release(PLAY), 0, 0, "release with nothing down");
    ExpectStep(s, Press(UNMAPPED), RC_ACT_UNMAPPED, UNMAPPED, "unmapped press");
    ExpectStep(s, IDLE, 0, UNMAPPED, "unmapped held");
    ExpectStep(s, Release(UNMAPPED), 0, 0, "unmapped release");
    // Only 1 is a press: 2 (a keyboard's auto-repeat) and -1 release the key.
    for (const std::int32_t value : {2, -1}) {
        ExpectStep(s, Press(VOLUME_PLUS), RC_ACT_VOLUME_UP, VOLUME_PLUS, "volume press");
        ExpectStep(s, Release(VOLUME_PLUS, value), 0, 0, "odd value");
        ExpectStep(s, IDLE, 0, 0, "no repeat after odd value");
    }
    // Another key pressed while Next is down takes over: no Next at all.
    ExpectStep(s, Press(NEXT), 0, NEXT, "next press");
    ExpectStep(s, Press(PLAY), RC_ACT_PLAY, PLAY, "play over next");
    ExpectStep(s, Release(PLAY), 0, 0, "play release");
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
        for (int fd : {pipe_[0], pipe_[1], listener_})
            if (fd >= 0)
                close(fd);
    }
    void Send(std::uint32_t code, std::int32_t value) const
    {
        RaytacReport r {};
        r.events[RAYTAC_KEY_EVENT] = {code, value};
        ASSERT_EQ(write(pipe_[1], &r, sizeof r), static_cast<ssize_t>(sizeof r));
    }
    void Listen() { listener_ = vt::BindUnix(MEDIA_CENTER_SOCKET_PATH, SOCK_DGRAM); }
    // Every datagram waiting at the listener, as its raw bytes.
    std::vector<std::string> Offered() const
    {
        std::vector<std::string> got;
        char buf[64];
        for (ssize_t n; (n = recv(listener_, buf, sizeof buf, MSG_DONTWAIT)) >= 0;)
            got.emplace_back(buf, static_cast<size_t>(n));
        return got;
    }
    static std::string Bytes(std::uint32_t code) { return std::string(reinterpret_cast<char*>(&code), 4); }

    vt::SyslogSink log_;
    int pipe_[2] = {-1, -1};
    int listener_ = -1;
};

TEST_F(RaytacReading, KeysGoToTheMediaCenterWhenItListensAndAreActedOnWhenNot)
{
    Send(PLAY, 1);
    EXPECT_EQ(RaytacRead(), RC_ACT_PLAY);  // no listener: the daemon acts
    EXPECT_EQ(RaytacHold.lastCode, PLAY);
    Send(UNMAPPED, 1);
    EXPECT_EQ(RaytacRead(), RC_ACT_UNMAPPED);

    Listen();
    ASSERT_GE(listener_, 0);
    Send(PLAY, 1);
    EXPECT_EQ(RaytacRead(), RC_ACT_NONE);  // delivered: left to the interface
    EXPECT_EQ(RaytacHold.lastCode, PLAY);
    EXPECT_EQ(Offered(), std::vector<std::string> {Bytes(PLAY)});
    Send(PLAY, 0);
    EXPECT_EQ(RaytacRead(), RC_ACT_NONE);
    EXPECT_TRUE(Offered().empty());  // a release of Play offers nothing

    // Volume Plus held: offered at the press and on each idle wait, never acted on.
    Send(VOLUME_PLUS, 1);
    EXPECT_EQ(RaytacRead(), RC_ACT_NONE);
    EXPECT_EQ(RaytacRead(), RC_ACT_NONE);
    EXPECT_EQ(Offered(), (std::vector<std::string> {Bytes(VOLUME_PLUS), Bytes(VOLUME_PLUS)}));

    // The interface goes away: the same held key is acted on again.
    close(listener_);
    listener_ = -1;
    EXPECT_EQ(RaytacRead(), RC_ACT_VOLUME_UP);
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
}

TEST_F(RaytacReading, BadReportsAreLoggedDroppedAndLeaveTheStateAlone)
{
    Send(VOLUME_PLUS, 1);
    ASSERT_EQ(RaytacRead(), RC_ACT_VOLUME_UP);
    const RaytacHoldState before = RaytacHold;
    const struct {
        size_t size;
        const char* message;
    } bad[] = {
        {80, "hw_raytac.cpp (311) The hid response is too short. ret:80 (10)"},
        {144, "hw_raytac.cpp (311) The hid response is too short. ret:144 (18)"},
        {71, "hw_raytac.cpp (311) The hid response is too short. ret:71 (8)"},
        {8, "hw_raytac.cpp (311) The hid response is too short. ret:8 (1)"},
        {7, "hw_raytac.cpp (304) Got short read from device!"},
    };
    for (const auto& b : bad) {
        // Every bad report carries a Play press where a report's key would be.
        std::vector<unsigned char> bytes(b.size);
        RaytacReport r {};
        r.events[RAYTAC_KEY_EVENT] = {PLAY, 1};
        for (size_t i = 0; i < bytes.size(); ++i)
            bytes[i] = reinterpret_cast<const unsigned char*>(&r)[i % sizeof r];
        ASSERT_EQ(write(pipe_[1], bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
        log_.Clear();
        EXPECT_EQ(RaytacRead(), -1) << b.size;
        ASSERT_TRUE(log_.WaitFor(b.message, 2000)) << log_.Dump();
        EXPECT_EQ(log_.Lines().size(), 1u) << log_.Dump();
        EXPECT_EQ(std::memcmp(&RaytacHold, &before, sizeof before), 0) << b.size;
    }
    // The writer gone: end of file reads as a short report.
    close(pipe_[1]);
    pipe_[1] = -1;
    log_.Clear();
    EXPECT_EQ(RaytacRead(), -1);
    EXPECT_TRUE(log_.WaitFor("hw_raytac.cpp (304) Got short read from device!", 2000));

    // A failing read is silent and changes nothing either.
    const int dir = open("/tmp", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    ASSERT_GE(dir, 0);
    raytac.descriptor = dir;
    log_.Clear();
    EXPECT_EQ(RaytacRead(), -1);
    close(dir);
    EXPECT_EQ(std::memcmp(&RaytacHold, &before, sizeof before), 0);
    usleep(100000);
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
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
    EXPECT_EQ(raytac.descriptor, -1);
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
