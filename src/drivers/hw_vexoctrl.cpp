#include "drivers/hw_vexoctrl.hpp"

#include <sys/select.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/log.hpp"
#include "common/paths.hpp"
#include "common/socket.hpp"

RcDriver vexoctrl = {"vexoctrl", RC_CTRL_SOCKET_PATH, -1, CtrlSockOpen, CtrlSockRead, CtrlSockClose};

std::int32_t CtrlSockClients[CTRL_SOCK_SLOTS] = {-1, -1, -1, -1};

namespace {

// Pending connections the listening socket queues while every slot is held.
constexpr std::int32_t CTRL_SOCK_BACKLOG = 4;

// The action message: one native-order 32-bit code per connection.
static_assert(sizeof(RcAction) == 4);

// Marks in ready the held clients that have data or have hung up, without
// waiting; returns select's count, negative on failure.
int SelectReadyClients(fd_set& ready)
{
    FD_ZERO(&ready);
    int maxFd = -1;
    for (const std::int32_t fd : CtrlSockClients) {
        if (fd == SOCKET_SLOT_FREE)
            continue;
        FD_SET(fd, &ready);
        if (fd > maxFd)
            maxFd = fd;
    }
    const fd_set wanted = ready;
    for (;;) {
        timeval noWait {0, 0};
        const int n = select(maxFd + 1, &ready, nullptr, nullptr, &noWait);
        if (n >= 0 || errno != EINTR)
            return n;
        ready = wanted;
    }
}

}  // namespace

std::int32_t CtrlSockOpen()
{
    if (vexoctrl.descriptor >= 0)
        return 0;
    const std::int32_t fd = SocketListenUnix(vexoctrl.devicePath, CTRL_SOCK_BACKLOG);
    if (fd < 0) {
        LogError(__FILE_NAME__, 55, "failed to create %s (%s).", vexoctrl.devicePath,
                 std::strerror(errno));
        return -1;
    }
    vexoctrl.descriptor = fd;
    for (std::int32_t& slot : CtrlSockClients)
        slot = SOCKET_SLOT_FREE;
    return 0;
}

std::int32_t CtrlSockRead()
{
    if (vexoctrl.descriptor < 0)
        return 0;
    SocketAcceptClient(vexoctrl.descriptor, CtrlSockClients, CTRL_SOCK_SLOTS);

    fd_set ready;
    if (SelectReadyClients(ready) <= 0)
        return 0;
    for (std::int32_t& slot : CtrlSockClients) {
        if (slot == SOCKET_SLOT_FREE || !FD_ISSET(slot, &ready))
            continue;
        // The bytes received fill the value from its first byte; a short or
        // failed read leaves the rest (or all) zero. The connection is read
        // once and then closed, whatever came.
        unsigned char bytes[sizeof(RcAction)] = {};
        [[maybe_unused]] const ssize_t got = read(slot, bytes, sizeof bytes);
        close(slot);
        slot = SOCKET_SLOT_FREE;
        RcAction value;
        std::memcpy(&value, bytes, sizeof value);
        return value;
    }
    return 0;
}

std::int32_t CtrlSockClose()
{
    if (vexoctrl.descriptor >= 0) {
        close(vexoctrl.descriptor);
        vexoctrl.descriptor = -1;
        // Connections accepted but not read would otherwise stay open, and
        // be forgotten by the next open.
        for (std::int32_t& slot : CtrlSockClients) {
            if (slot != SOCKET_SLOT_FREE)
                close(slot);
            slot = SOCKET_SLOT_FREE;
        }
    }
    unlink(vexoctrl.devicePath);
    return 0;
}
