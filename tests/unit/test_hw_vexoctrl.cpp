// The control-socket driver against real clients on "/tmp/vexoctrl".
#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdint>
#include <cstring>
#include <initializer_list>
#include <vector>

#include <gtest/gtest.h>

#include "drivers/hw_vexoctrl.hpp"
#include "harness.hpp"
#include "unix_client.hpp"

namespace {

constexpr char kPath[] = "/tmp/vexoctrl";

// The value a read must return for these bytes: they fill it from its first
// byte, the rest stays 0, whatever the machine's byte order.
std::int32_t FromBytes(std::initializer_list<unsigned char> bytes)
{
    unsigned char raw[4] = {};
    std::memcpy(raw, bytes.begin(), bytes.size());
    std::int32_t value;
    std::memcpy(&value, raw, sizeof value);
    return value;
}

bool IsSocket(const char* path)
{
    struct stat st {};
    return lstat(path, &st) == 0 && S_ISSOCK(st.st_mode);
}

std::vector<std::int32_t> Slots()
{
    return {CtrlSockClients, CtrlSockClients + CTRL_SOCK_SLOTS};
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
    int Connect()
    {
        const int fd = vt::ConnectUnix(kPath);
        EXPECT_GE(fd, 0);
        clients_.push_back(fd);
        return fd;
    }
    int Send(const void* data, std::size_t size)
    {
        const int fd = Connect();
        EXPECT_EQ(write(fd, data, size), static_cast<ssize_t>(size));
        return fd;
    }
    int Send(std::int32_t code) { return Send(&code, sizeof code); }

    std::vector<int> clients_;
};

TEST_F(CtrlSock, EachConnectionGivesItsValueUnchangedOnceAndIsClosed)
{
    for (std::int32_t code : {6, 0, -7, 26, 0x7FFFFFFF}) {
        const int fd = Send(code);
        EXPECT_EQ(CtrlSockRead(), code);
        EXPECT_EQ(Slots(), std::vector<std::int32_t>(4, -1)) << code;
        // The daemon hangs up after its one read and never answers.
        ASSERT_TRUE(vt::Readable(fd, 1000)) << code;
        char c;
        EXPECT_EQ(read(fd, &c, 1), 0) << code;
    }
    EXPECT_EQ(CtrlSockRead(), 0);
}

TEST_F(CtrlSock, OnlyTheFirstFourBytesCountAndShortMessagesFillFromTheFirstByte)
{
    const std::int32_t two[2] = {9, 6};
    Send(two, sizeof two);
    EXPECT_EQ(CtrlSockRead(), 9);
    EXPECT_EQ(CtrlSockRead(), 0);  // the rest went with the connection

    const unsigned char one = 0x06;
    Send(&one, 1);
    EXPECT_EQ(CtrlSockRead(), FromBytes({0x06}));

    const unsigned char three[3] = {0x01, 0x02, 0x03};
    Send(three, sizeof three);
    EXPECT_EQ(CtrlSockRead(), FromBytes({0x01, 0x02, 0x03}));

    // Connecting and hanging up without a word gives nothing and frees the slot.
    close(Connect());
    EXPECT_EQ(CtrlSockRead(), 0);
    EXPECT_EQ(Slots(), std::vector<std::int32_t>(4, -1));
}

TEST_F(CtrlSock, FiveClientsAtOnceGiveFiveActionsInFiveReads)
{
    for (std::int32_t code : {2, 4, 6, 8, 10})
        Send(code);
    for (std::int32_t code : {2, 4, 6, 8, 10})
        EXPECT_EQ(CtrlSockRead(), code);
    EXPECT_EQ(CtrlSockRead(), 0);
}

TEST_F(CtrlSock, SilentClientsHoldTheirSlotsAndTheLowestReadySlotIsReadFirst)
{
    std::vector<int> fds;
    for (int i = 0; i < 5; ++i)
        fds.push_back(Connect());
    // One accepted per read, into the lowest free slot; the fifth stays queued.
    for (int i = 0; i < 6; ++i)
        EXPECT_EQ(CtrlSockRead(), 0);
    const std::vector<std::int32_t> held = Slots();
    for (std::int32_t fd : held) {
        ASSERT_GE(fd, 0);
        // Accepted clients are non-blocking, so a read can never wait on one.
        EXPECT_NE(fcntl(fd, F_GETFL) & O_NONBLOCK, 0);
    }

    // Clients in slots 3 and 1 speak, and the queued fifth: slot 1 first.
    const std::int32_t three = 33, one = 11, fifth = 55;
    ASSERT_EQ(write(fds[3], &three, 4), 4);
    ASSERT_EQ(write(fds[1], &one, 4), 4);
    ASSERT_EQ(write(fds[4], &fifth, 4), 4);
    EXPECT_EQ(CtrlSockRead(), 11);
    EXPECT_EQ(CtrlSockClients[1], -1);
    // The fifth is accepted into slot 1 and, lower than slot 3, read first.
    EXPECT_EQ(CtrlSockRead(), 55);
    EXPECT_EQ(CtrlSockClients[1], -1);
    EXPECT_EQ(CtrlSockClients[3], held[3]);
    EXPECT_EQ(CtrlSockRead(), 33);
    EXPECT_EQ(CtrlSockClients[0], held[0]);
    EXPECT_EQ(CtrlSockClients[2], held[2]);

    // Closing the driver drops the connections it still held.
    CtrlSockClose();
    ASSERT_TRUE(vt::Readable(fds[0], 1000));
    char c;
    EXPECT_EQ(read(fds[0], &c, 1), 0);
}

TEST(CtrlSockLifecycle, OpenReplacesWhatStandsAtThePathAndCloseAlwaysRemovesIt)
{
    vt::SyslogSink log;
    CtrlSockClose();
    EXPECT_EQ(CtrlSockRead(), 0);  // closed: nothing, at once

    // A socket file left by an earlier run is replaced, and so is a plain file.
    const int stale = vt::BindUnix(kPath);
    ASSERT_GE(stale, 0);
    close(stale);
    ASSERT_EQ(CtrlSockOpen(), 0);
    const int client = vt::SendAction(6);  // the new socket is the one listening
    EXPECT_GE(client, 0);
    EXPECT_EQ(CtrlSockRead(), 6);
    close(client);
    CtrlSockClose();
    vt::WriteFile(kPath, "left over");
    ASSERT_EQ(CtrlSockOpen(), 0);
    EXPECT_TRUE(IsSocket(kPath));
    const std::int32_t fd = vexoctrl.descriptor;
    EXPECT_EQ(CtrlSockOpen(), 0);  // already listening: nothing changes
    EXPECT_EQ(vexoctrl.descriptor, fd);
    EXPECT_EQ(CtrlSockClose(), 0);
    EXPECT_EQ(vexoctrl.descriptor, -1);
    EXPECT_FALSE(vt::PathExists(kPath));
    EXPECT_EQ(fcntl(fd, F_GETFD), -1);  // the listening socket is closed

    // Close without an open still removes the path.
    vt::WriteFile(kPath, "x");
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
    EXPECT_EQ(CtrlSockClose(), 0);
    unlink((std::string(kPath) + "/keep").c_str());
    rmdir(kPath);
}

}  // namespace
