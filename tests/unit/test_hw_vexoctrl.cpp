// The control-socket driver against real clients on "/tmp/vexoctrl".
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "drivers/hw_vexoctrl.hpp"
#include "harness.hpp"
#include "unix_client.hpp"

namespace {

constexpr char kPath[] = "/tmp/vexoctrl";
const std::vector<std::int32_t> kAllFree(CTRL_SOCK_SLOTS, -1);

std::vector<std::int32_t> Slots() { return {CtrlSockClients, CtrlSockClients + CTRL_SOCK_SLOTS}; }

// True once the daemon side has hung up on fd.
bool HungUp(int fd)
{
    char c;
    return vt::Readable(fd, 1000) && read(fd, &c, 1) == 0;
}

// A driver listening afresh; every client a test makes is closed at the end.
class CtrlSock : public ::testing::Test {
protected:
    void SetUp() override
    {
        CtrlSockClose();
        ASSERT_EQ(CtrlSockOpen(), 0);
    }
    void TearDown() override
    {
        CtrlSockClose();
        for (int fd : clients_)
            close(fd);
    }
    int Send(const void* data, std::size_t size)
    {
        const int fd = vt::ConnectUnix(kPath);
        EXPECT_GE(fd, 0);
        clients_.push_back(fd);
        EXPECT_EQ(write(fd, data, size), static_cast<ssize_t>(size));
        return fd;
    }
    std::vector<int> clients_;
};

TEST_F(CtrlSock, EachConnectionGivesTheValueOfItsFirstFourBytesOnce)
{
    for (std::int32_t code : {6, 0, -7, 26}) {
        const int fd = Send(&code, 4);
        EXPECT_EQ(CtrlSockRead(), code);
        EXPECT_TRUE(HungUp(fd)) << code;
    }
    const std::int32_t two[2] = {9, 6};
    Send(two, sizeof two);
    EXPECT_EQ(CtrlSockRead(), 9);
    // Bytes fill the value from its first byte, whatever the byte order.
    const unsigned char one = 0x06;
    std::int32_t expected = 0;
    std::memcpy(&expected, &one, 1);
    Send(&one, 1);
    EXPECT_EQ(CtrlSockRead(), expected);
    const int silent = Send(nullptr, 0);
    close(silent);  // connect and hang up: nothing
    EXPECT_EQ(CtrlSockRead(), 0);
    EXPECT_EQ(CtrlSockRead(), 0);
    EXPECT_EQ(Slots(), kAllFree);
}

TEST_F(CtrlSock, FiveClientsAtOnceGiveFiveActionsInFiveReads)
{
    for (std::int32_t code : {2, 4, 6, 8, 10})
        Send(&code, 4);
    for (std::int32_t code : {2, 4, 6, 8, 10})
        EXPECT_EQ(CtrlSockRead(), code);
    EXPECT_EQ(CtrlSockRead(), 0);
}

TEST_F(CtrlSock, SilentClientsHoldTheirSlotsAndTheLowestReadySlotIsReadFirst)
{
    std::vector<int> fds;
    for (int i = 0; i < 5; ++i)
        fds.push_back(Send(nullptr, 0));
    // One accepted per read into the lowest free slot; the fifth stays queued.
    for (int i = 0; i < 6; ++i)
        EXPECT_EQ(CtrlSockRead(), 0);
    const std::vector<std::int32_t> held = Slots();
    for (std::int32_t fd : held) {
        ASSERT_GE(fd, 0);
        EXPECT_NE(fcntl(fd, F_GETFL) & O_NONBLOCK, 0);  // a read can never wait on one
    }

    // Slots 3 and 1 speak, and the queued fifth: slot 1 first, then the
    // fifth, accepted into slot 1 and lower than slot 3.
    const std::int32_t three = 33, one = 11, fifth = 55;
    ASSERT_EQ(write(fds[3], &three, 4), 4);
    ASSERT_EQ(write(fds[1], &one, 4), 4);
    ASSERT_EQ(write(fds[4], &fifth, 4), 4);
    EXPECT_EQ(CtrlSockRead(), 11);
    EXPECT_EQ(CtrlSockRead(), 55);
    EXPECT_EQ(CtrlSockRead(), 33);
    EXPECT_EQ(Slots(), (std::vector<std::int32_t>{held[0], -1, held[2], -1}));

    // Closing the driver drops the connections it still held.
    CtrlSockClose();
    EXPECT_TRUE(HungUp(fds[0]));
}

TEST(CtrlSockLifecycle, OpenReplacesWhatStandsAtThePathAndCloseAlwaysRemovesIt)
{
    vt::SyslogSink log;
    CtrlSockClose();
    EXPECT_EQ(CtrlSockRead(), 0);  // closed: nothing, at once
    close(vt::BindUnix(kPath));    // a socket file left by an earlier run
    ASSERT_EQ(CtrlSockOpen(), 0);
    const int client = vt::SendAction(6);  // the new socket is the one listening
    EXPECT_EQ(CtrlSockRead(), 6);
    close(client);
    CtrlSockClose();

    vt::WriteFile(kPath, "left over");
    ASSERT_EQ(CtrlSockOpen(), 0);
    const std::int32_t fd = vexoctrl.descriptor;
    EXPECT_EQ(CtrlSockOpen(), 0);  // already listening: nothing changes
    EXPECT_EQ(vexoctrl.descriptor, fd);
    EXPECT_EQ(CtrlSockClose(), 0);
    EXPECT_EQ(vexoctrl.descriptor, -1);
    EXPECT_EQ(fcntl(fd, F_GETFD), -1);
    EXPECT_FALSE(vt::PathExists(kPath));
    vt::WriteFile(kPath, "x");  // close without an open still removes the path
    EXPECT_EQ(CtrlSockClose(), 0);
    EXPECT_FALSE(vt::PathExists(kPath));
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

TEST(CtrlSockLifecycle, AFailedOpenLogsBothStepsAndLeavesTheDriverClosed)
{
    vt::SyslogSink log;
    CtrlSockClose();
    // A non-empty directory cannot be removed, so the bind finds the path taken.
    ASSERT_EQ(mkdir(kPath, 0755), 0);
    vt::WriteFile(std::string(kPath) + "/keep", "");
    EXPECT_EQ(CtrlSockOpen(), -1);
    EXPECT_EQ(vexoctrl.descriptor, -1);
    EXPECT_EQ(CtrlSockRead(), 0);
    ASSERT_TRUE(log.WaitFor("hw_vexoctrl.cpp"));
    EXPECT_EQ(log.Lines(), (std::vector<std::string>{
                               "socket.cpp (45) Failed to bind socket. (Address already in use)",
                               "hw_vexoctrl.cpp (55) failed to create /tmp/vexoctrl (Address already in use).",
                           }));
    CtrlSockClose();
}

}  // namespace
