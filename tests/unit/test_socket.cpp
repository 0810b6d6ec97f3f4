// The Unix socket helpers: listening, the never-waiting accept into a slot
// table, and the media-center key datagram.
#include <fcntl.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <unistd.h>

#include <chrono>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "common/socket.hpp"
#include "harness.hpp"
#include "unix_client.hpp"

namespace {

constexpr char kMediaCenter[] = "/tmp/MediaCenter.sock";

void NoOp(int) {}

TEST(MediaCenterSendKey, WithNobodyBoundReportsNotDeliveredAndLogsNothing)
{
    vt::SyslogSink log;
    unlink(kMediaCenter);
    EXPECT_LT(MediaCenterSendKey(0x0007002C), 0);

    // A socket file whose receiver has gone.
    const int gone = vt::BindUnix(kMediaCenter, SOCK_DGRAM);
    ASSERT_GE(gone, 0);
    close(gone);
    ASSERT_TRUE(vt::PathExists(kMediaCenter));
    EXPECT_LT(MediaCenterSendKey(0x0007002C), 0);

    usleep(100000);
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
    unlink(kMediaCenter);
}

TEST(MediaCenterSendKey, DeliversExactlyFourBytesInNativeOrder)
{
    const int rx = vt::BindUnix(kMediaCenter, SOCK_DGRAM);
    ASSERT_GE(rx, 0);
    for (std::uint32_t code : {0x0007002Cu, 0x00070064u, 0u, 0xFFFFFFFFu}) {
        EXPECT_EQ(MediaCenterSendKey(code), 0);
        unsigned char buf[16] = {};
        ASSERT_EQ(recv(rx, buf, sizeof buf, MSG_DONTWAIT), 4) << code;
        unsigned char expected[4];
        std::memcpy(expected, &code, 4);
        EXPECT_EQ(std::memcmp(buf, expected, 4), 0) << code;
    }
    close(rx);
    unlink(kMediaCenter);
}

// A receiver that is bound but has stopped reading fills its queue. The
// sender must then report "not delivered" at once instead of blocking: a
// blocked send would freeze the daemon for good. A repeating timer breaks a
// blocking send, so a regression fails here instead of hanging the suite.
TEST(MediaCenterSendKey, AReceiverThatNeverReadsNeverBlocksTheSender)
{
    const int rx = vt::BindUnix(kMediaCenter, SOCK_DGRAM);
    ASSERT_GE(rx, 0);
    struct sigaction sa {};
    sa.sa_handler = NoOp;  // no SA_RESTART: the timer interrupts a blocked send
    struct sigaction old {};
    sigaction(SIGALRM, &sa, &old);
    itimerval every {{1, 0}, {1, 0}};
    setitimer(ITIMER_REAL, &every, nullptr);

    const auto start = std::chrono::steady_clock::now();
    const auto limit = std::chrono::seconds(8);
    std::vector<std::int32_t> results;
    while (results.size() < 30 && std::chrono::steady_clock::now() - start < limit)
        results.push_back(MediaCenterSendKey(static_cast<std::uint32_t>(results.size())));
    const auto elapsed = std::chrono::steady_clock::now() - start;

    itimerval off {};
    setitimer(ITIMER_REAL, &off, nullptr);
    sigaction(SIGALRM, &old, nullptr);
    ASSERT_EQ(results.size(), 30u) << "sends blocked";
    EXPECT_LT(elapsed, limit) << "a send blocked until the timer";

    // The first keys are queued; once the queue is full every later one is
    // refused, and exactly the keys reported delivered are in the queue.
    EXPECT_EQ(results.front(), 0);
    EXPECT_LT(results.back(), 0);
    std::size_t delivered = 0;
    while (delivered < results.size() && results[delivered] == 0)
        ++delivered;
    for (std::size_t i = delivered; i < results.size(); ++i)
        EXPECT_LT(results[i], 0) << "key " << i;
    for (std::size_t i = 0; i < delivered; ++i) {
        std::uint32_t got = 0xDEADBEEF;
        ASSERT_EQ(recv(rx, &got, sizeof got, MSG_DONTWAIT), 4) << i;
        EXPECT_EQ(got, i);
    }
    std::uint32_t extra;
    EXPECT_LT(recv(rx, &extra, sizeof extra, MSG_DONTWAIT), 0);

    // Once the interface reads again, keys are delivered again.
    EXPECT_EQ(MediaCenterSendKey(99), 0);
    close(rx);
    unlink(kMediaCenter);
}

TEST(SocketListenUnix, RefusesAPathThatDoesNotFitInsteadOfTruncatingIt)
{
    vt::SyslogSink log;
    // 107 characters fit with the terminating zero; 108 do not.
    const std::string fits = "/tmp/" + std::string(102, 'f');
    const std::string tooLong = "/tmp/" + std::string(103, 'l');
    ASSERT_EQ(fits.size(), 107u);
    const int fd = SocketListenUnix(fits.c_str(), 4);
    EXPECT_GE(fd, 0);
    close(fd);
    unlink(fits.c_str());

    EXPECT_EQ(SocketListenUnix(tooLong.c_str(), 4), -1);
    EXPECT_FALSE(vt::PathExists(tooLong));
    ASSERT_TRUE(log.WaitFor("socket.cpp"));
    EXPECT_EQ(log.Lines(), std::vector<std::string>{"socket.cpp (45) Failed to bind socket. (File name too long)"});
}

// The slot table: at most one connection per call, into the lowest free
// slot, never when every slot is taken or there are none.
TEST(SocketAcceptClient, TakesAtMostOneWaitingConnectionIntoTheLowestFreeSlot)
{
    const int listener = SocketListenUnix("/tmp/accept-test", 8);
    ASSERT_GE(listener, 0);
    const int busy = open("/dev/null", O_RDONLY);  // stands for a held client
    std::int32_t slots[4] = {busy, -1, busy, -1};

    // Nothing waiting: nothing changes.
    EXPECT_EQ(SocketAcceptClient(listener, slots, 4), 0);
    EXPECT_EQ(slots[1], -1);
    EXPECT_EQ(slots[3], -1);

    std::vector<int> clients;
    for (int i = 0; i < 3; ++i)
        clients.push_back(vt::ConnectUnix("/tmp/accept-test"));
    EXPECT_EQ(SocketAcceptClient(listener, slots, 0), 0);  // no slots, no accept

    EXPECT_EQ(SocketAcceptClient(listener, slots, 4), 0);
    ASSERT_GE(slots[1], 0);
    EXPECT_NE(slots[1], busy);
    EXPECT_EQ(slots[3], -1);  // one per call
    EXPECT_NE(fcntl(slots[1], F_GETFL) & O_NONBLOCK, 0);
    EXPECT_EQ(SocketAcceptClient(listener, slots, 4), 0);
    ASSERT_GE(slots[3], 0);

    // Full: the third stays queued until a slot is free again.
    const std::int32_t before[4] = {slots[0], slots[1], slots[2], slots[3]};
    EXPECT_EQ(SocketAcceptClient(listener, slots, 4), 0);
    EXPECT_EQ(std::memcmp(before, slots, sizeof slots), 0);
    close(slots[1]);
    slots[1] = -1;
    EXPECT_EQ(SocketAcceptClient(listener, slots, 4), 0);
    EXPECT_GE(slots[1], 0);
    EXPECT_EQ(SocketAcceptClient(listener, slots, 4), 0);  // none left

    close(slots[1]);
    close(slots[3]);
    for (int fd : clients)
        close(fd);
    close(busy);
    close(listener);
}

}  // namespace
