#include "common/socket.hpp"

#include <fcntl.h>
#include <sys/select.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstring>

#include "common/log.hpp"

// The address is always handed over whole: family and the 108-byte path.
static_assert(sizeof(sockaddr_un) == 110);
static_assert(offsetof(sockaddr_un, sun_family) == 0);
static_assert(offsetof(sockaddr_un, sun_path) == 2);
static_assert(sizeof(sockaddr_un::sun_path) == 108);

namespace {

// Closes fd without letting the close disturb the errno being reported.
void CloseKeepingErrno(int fd)
{
    const int saved = errno;
    close(fd);
    errno = saved;
}

}  // namespace

bool SocketFillAddress(sockaddr_un& addr, const char* path)
{
    std::memset(&addr, 0, sizeof addr);
    addr.sun_family = AF_UNIX;
    if (path == nullptr)
        return false;
    const std::size_t len = strnlen(path, sizeof addr.sun_path);
    if (len >= sizeof addr.sun_path)
        return false;
    std::memcpy(addr.sun_path, path, len);
    return true;
}

std::int32_t SocketListenUnix(const char* path, std::int32_t backlog)
{
    sockaddr_un addr;
    // A path that does not fit could only be bound truncated, elsewhere: refuse
    // it before anything is created or removed.
    if (!SocketFillAddress(addr, path)) {
        errno = ENAMETOOLONG;
        LogError(__FILE_NAME__, 45, "Failed to bind socket. (%s)", std::strerror(errno));
        return -1;
    }

    const int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    if (fd < 0) {
        LogError(__FILE_NAME__, 33, "failed to connect socket.");
        return -1;
    }

    // A socket file left by an earlier run would make the bind fail.
    unlink(path);

    if (bind(fd, reinterpret_cast<const sockaddr*>(&addr), SOCKET_ADDRESS_LENGTH) == -1) {
        LogError(__FILE_NAME__, 45, "Failed to bind socket. (%s)", std::strerror(errno));
        CloseKeepingErrno(fd);
        return -1;
    }
    if (listen(fd, backlog) == -1) {
        LogError(__FILE_NAME__, 50, "Failed to listen socket. (%s)", std::strerror(errno));
        CloseKeepingErrno(fd);
        return -1;
    }
    return fd;
}

std::int32_t SocketAcceptClient(std::int32_t listenFd, std::int32_t* slots, std::int32_t slotCount)
{
    // fd_set holds descriptors below FD_SETSIZE only; anything else would be
    // written beyond it.
    if (listenFd < 0 || listenFd >= FD_SETSIZE)
        return 0;

    fd_set readSet;
    FD_ZERO(&readSet);
    FD_SET(listenFd, &readSet);
    std::int32_t freeSlot = -1;
    for (std::int32_t i = 0; i < slotCount; ++i) {
        const std::int32_t fd = slots[i];
        if (fd == SOCKET_SLOT_FREE) {
            if (freeSlot < 0)
                freeSlot = i;
        } else if (fd >= 0 && fd < FD_SETSIZE) {
            FD_SET(fd, &readSet);
        }
    }

    timeval noWait {0, 0};
    if (select(FD_SETSIZE, &readSet, nullptr, nullptr, &noWait) <= 0)
        return 0;
    if (!FD_ISSET(listenFd, &readSet))
        return 0;
    // Every slot taken: the connection stays queued for a later call.
    if (freeSlot < 0)
        return 0;

    sockaddr_un peer;
    socklen_t peerLength = SOCKET_ADDRESS_LENGTH;
    const int client = accept(listenFd, reinterpret_cast<sockaddr*>(&peer), &peerLength);
    if (client == -1) {
        LogError(__FILE_NAME__, 114, "Failed to accept client. (%s)", std::strerror(errno));
        return -1;
    }
    // The caller selects on its clients: one it could not select on is
    // refused like a descriptor the system could not give.
    if (client >= FD_SETSIZE) {
        close(client);
        errno = EMFILE;
        LogError(__FILE_NAME__, 114, "Failed to accept client. (%s)", std::strerror(errno));
        return -1;
    }
    // Clients are handed over non-blocking: one that cannot be made so is
    // closed and refused like a failed accept, not kept as it came.
    const int flags = fcntl(client, F_GETFL);
    if (flags == -1 || fcntl(client, F_SETFL, flags | O_NONBLOCK) == -1) {
        CloseKeepingErrno(client);
        LogError(__FILE_NAME__, 114, "Failed to accept client. (%s)", std::strerror(errno));
        return -1;
    }
    slots[freeSlot] = client;
    return 0;
}

std::int32_t MediaCenterSendKey(std::uint32_t code)
{
    sockaddr_un addr;
    SocketFillAddress(addr, MEDIA_CENTER_SOCKET_PATH);

    const int fd = socket(AF_UNIX, SOCK_DGRAM, 0);
    if (fd < 0)
        return -1;
    // Never wait: a media-center interface that is bound but has stopped
    // reading fills its queue, and a blocking send would then freeze the
    // whole daemon. A full queue means "not delivered"; the daemon then acts
    // on the key itself.
    const ssize_t sent = sendto(fd, &code, sizeof code, MSG_DONTWAIT,
                                reinterpret_cast<const sockaddr*>(&addr), SOCKET_ADDRESS_LENGTH);
    close(fd);
    return sent >= 0 ? 0 : -1;
}
