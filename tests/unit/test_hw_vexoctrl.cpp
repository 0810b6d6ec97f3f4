// The control socket against clients on its built-in path, and the listening
// socket it is built on.
#include <sys/stat.h>

#include <cstring>

#include "drivers/hw_vexoctrl.hpp"
#include "harness.hpp"

namespace {

std::string Bytes(std::int32_t v) { return std::string(reinterpret_cast<const char*>(&v), 4); }
std::vector<std::int32_t> Slots() { return {CtrlSockClients, CtrlSockClients + CTRL_SOCK_SLOTS}; }
// A client that has sent bytes, and hung up when told to; it never waits for a full queue.
int Client(const std::string& bytes = "", bool hangUp = false)
{
    const int fd = UnixConnect(RC_CTRL_SOCKET_PATH, SOCK_STREAM | SOCK_NONBLOCK, 0, nullptr);
    EXPECT_EQ(write(fd, bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
    if (hangUp)
        shutdown(fd, SHUT_WR);
    return fd;
}

// Whether the driver has hung up on a client (a reset when it left bytes unread).
bool HungUp(int fd)
{
    pollfd ready {fd, POLLIN, 0};
    char c;
    return poll(&ready, 1, 1000) == 1 && read(fd, &c, 1) <= 0;
}

TEST(CtrlSock, EachClientGivesTheFirstFourBytesItSentOnce)
{
    vt::Logged();
    ASSERT_EQ(CtrlSockOpen(), 0);
    std::int32_t lone = 0;  // one byte fills the value from its first byte: 0x06000000 on the target
    std::memcpy(&lone, "\x06", 1);
    for (const auto& [sent, value] : {std::pair {Bytes(6), 6}, {Bytes(-7), -7}, {Bytes(26), 26},
                                      {Bytes(9) + Bytes(6), 9}, {std::string("\x06"), lone}, {"", 0}}) {
        const int fd = Client(sent, true);
        EXPECT_EQ(CtrlSockRead(), value);
        EXPECT_TRUE(HungUp(fd)) << value;
        EXPECT_EQ(Slots(), std::vector<std::int32_t>(CTRL_SOCK_SLOTS, -1));
        close(fd);
    }
    int fds[5];
    for (int i = 0; i < 5; ++i)
        fds[i] = Client(Bytes(i + 1));
    std::string got;  // five at once: five reads, in order
    for (int i = 0; i < 6; ++i)
        got += std::to_string(CtrlSockRead());
    EXPECT_EQ(got, "123450");
    for (const int fd : fds)
        close(fd);
    CtrlSockClose();
    EXPECT_TRUE(vt::Logged().empty());
}

TEST(CtrlSock, SilentClientsHoldTheirSlotsAndTheLowestReadySlotIsReadFirst)
{
    ASSERT_EQ(CtrlSockOpen(), 0);
    int fds[5];
    for (int& fd : fds)
        fd = Client();
    for (int i = 0; i < 5; ++i)  // one accepted per read, into the lowest free slot; the fifth waits
        EXPECT_EQ(CtrlSockRead(), 0);
    const std::vector<std::int32_t> held = Slots();
    for (const std::int32_t fd : held)
        EXPECT_TRUE(fd >= 0 && (fcntl(fd, F_GETFL) & O_NONBLOCK) != 0);  // a read never waits on one
    for (const auto& [client, code] : {std::pair {3, 33}, {1, 11}, {4, 55}})
        ASSERT_EQ(write(fds[client], Bytes(code).data(), 4), 4);
    std::string got;  // slot 1, then the fifth (now in slot 1), then slot 3
    for (int i = 0; i < 3; ++i)
        got += std::to_string(CtrlSockRead()) + " ";
    EXPECT_EQ(got, "11 55 33 ");
    EXPECT_EQ(Slots(), (std::vector<std::int32_t> {held[0], -1, held[2], -1}));
    CtrlSockClose();  // drops the connections it still holds
    EXPECT_TRUE(HungUp(fds[0]));
    for (const int fd : fds)
        close(fd);
}

TEST(CtrlSock, OpenReplacesWhatStandsAtThePathAndCloseAlwaysRemovesIt)
{
    vt::Logged();
    UnixFailure failed;
    close(UnixBind(RC_CTRL_SOCKET_PATH, SOCK_STREAM, 4, &failed));  // left by an earlier run
    ASSERT_EQ(CtrlSockOpen(), 0);
    const int fd = vexoctrl.descriptor;
    EXPECT_TRUE(CtrlSockOpen() == 0 && vexoctrl.descriptor == fd);  // already listening: nothing changes
    CtrlSockClose();
    EXPECT_EQ(CtrlSockRead(), 0);  // closed: nothing
    vt::WriteFile(RC_CTRL_SOCKET_PATH, "x");
    EXPECT_EQ(CtrlSockClose(), 0);  // closed, it removes the path all the same
    EXPECT_NE(access(RC_CTRL_SOCKET_PATH, F_OK), 0);
    ASSERT_EQ(mkdir(RC_CTRL_SOCKET_PATH, 0755), 0);  // with a file in it, a directory stays
    vt::WriteFile(RC_CTRL_SOCKET_PATH + std::string("/keep"), "");
    EXPECT_EQ(CtrlSockOpen(), -1);
    EXPECT_EQ(vt::Logged(), (std::vector<std::string> {
                                "socket.cpp (45) Failed to bind socket. (Address already in use)",
                                "hw_vexoctrl.cpp (55) failed to create /tmp/vexoctrl (Address already in use)."}));
}

}  // namespace
