// The Unix socket helpers. The slot table is driven through the control
// socket's own tests.
#include <signal.h>
#include <sys/socket.h>
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

// No receiver, or one whose file is left, is "not delivered". A receiver that
// is bound but has stopped reading fills its queue; the sender must then
// report "not delivered" at once, as a blocked send would freeze the daemon
// for good. A repeating timer breaks a blocked send, so a regression fails
// here instead of hanging the suite.
TEST(MediaCenterSendKey, AReceiverThatNeverReadsNeverBlocksTheSender)
{
    vt::SyslogSink log;
    unlink(kMediaCenter);
    EXPECT_LT(MediaCenterSendKey(1), 0);
    close(vt::BindUnix(kMediaCenter, SOCK_DGRAM));  // a receiver that left its file
    EXPECT_LT(MediaCenterSendKey(1), 0);

    const int rx = vt::BindUnix(kMediaCenter, SOCK_DGRAM);
    ASSERT_GE(rx, 0);
    struct sigaction sa {}, old {};
    sa.sa_handler = NoOp;  // no SA_RESTART: the timer interrupts a blocked send
    sigaction(SIGALRM, &sa, &old);
    itimerval every {{1, 0}, {1, 0}}, off {};
    setitimer(ITIMER_REAL, &every, nullptr);
    const auto start = std::chrono::steady_clock::now();
    std::vector<std::int32_t> results;
    while (results.size() < 30 && std::chrono::steady_clock::now() - start < std::chrono::seconds(8))
        results.push_back(MediaCenterSendKey(static_cast<std::uint32_t>(results.size())));
    setitimer(ITIMER_REAL, &off, nullptr);
    sigaction(SIGALRM, &old, nullptr);
    ASSERT_EQ(results.size(), 30u) << "sends blocked";

    // The first keys are queued, then every one is refused; exactly the keys
    // reported delivered are in the queue.
    std::size_t delivered = 0;
    while (delivered < results.size() && results[delivered] == 0)
        ++delivered;
    EXPECT_GT(delivered, 0u);
    for (std::size_t i = delivered; i < results.size(); ++i)
        EXPECT_LT(results[i], 0) << "key " << i;
    for (std::uint32_t i = 0, got = 0; i < delivered; ++i) {
        ASSERT_EQ(recv(rx, &got, sizeof got, MSG_DONTWAIT), 4);
        EXPECT_EQ(got, i);
    }
    EXPECT_EQ(MediaCenterSendKey(99), 0);  // read again, delivered again
    close(rx);
    unlink(kMediaCenter);
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();  // not delivered is no fault
}

TEST(SocketListenUnix, RefusesAPathThatDoesNotFitInsteadOfTruncatingIt)
{
    vt::SyslogSink log;
    const std::string fits = "/tmp/" + std::string(102, 'f');  // 107 and the zero
    const std::string tooLong = fits + "l";
    const int fd = SocketListenUnix(fits.c_str(), 4);
    EXPECT_GE(fd, 0);
    close(fd);
    EXPECT_EQ(SocketListenUnix(tooLong.c_str(), 4), -1);
    EXPECT_FALSE(vt::PathExists(tooLong));
    ASSERT_TRUE(log.WaitFor("socket.cpp"));
    EXPECT_EQ(log.Lines(), std::vector<std::string>{"socket.cpp (45) Failed to bind socket. (File name too long)"});
}

}  // namespace
